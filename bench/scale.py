"""What limits an appliance, and what a larger one would cost: computed from what small ones cost more with each target and
LUN, and held against a build with raised limits (build/bench-scale) that meets trees of that size."""

import dataclasses
import os
import pathlib
import re
import shutil
import statistics
import subprocess

from appliance_tree import disk_of, document, sessions_among_others, sessions_in_detail
from figures import Figure, Table, number
from runs import MOST_KIB, fake_iscsiadm, traced
from settled_waits import SETTLED
from world import SOCKET, WORK, drop_search_paths, in_turn, ktree, load, one_processor, output, program, resident

TOP = pathlib.Path(__file__).resolve().parent.parent
BUILD = TOP / "build/bench-scale"
SMALL = [(1, 1), (2, 1), (4, 1), (6, 1), (8, 1), (1, 8), (2, 8), (4, 8), (6, 8), (8, 2), (8, 4), (8, 8)]
LARGE = [(16, 16), (32, 16), (64, 16)]
TARGETS, LUNS = LARGE[-1]
LAYOUT = "include/tree_layout.h"
MOST_COUNT = 2  # % that a computed count may be beside the simulated one


def build():
    """Builds the tool and vvstat with limits for the largest."""
    subprocess.run(["cmake", "-S", TOP, "-B", BUILD, "-DCMAKE_BUILD_TYPE=Release", f"-DREMVOL_LIMITS={TARGETS};{LUNS}"], check=True,
                   stdout=subprocess.DEVNULL)
    subprocess.run(["cmake", "--build", BUILD, "-j", str(os.cpu_count()), "--target", "remvol", "vvstat"], check=True,
                   stdout=subprocess.DEVNULL)


def installed():
    """The folder of the programs with raised limits, as the product is installed; they share its libraries."""
    folder = pathlib.Path("/mnt/scale")
    folder.mkdir()
    drop_search_paths([shutil.copy(BUILD / "bin" / name, folder) for name in ("remvol", "vvstat")])
    return folder


def constant(file, name):
    """A number that a source has."""
    text = re.search(rf"\b{name}(?: =|\b) ?([^;,\n]+)", (TOP / file).read_text()).group(1)
    text = re.sub(r"size_t\{(\d+)\}", r"\1", text).replace("'", "").split("//")[0]
    return eval(text, {"__builtins__": {}})


# ---- what is measured ----

COMMANDS = {"remvol --status": ["remvol", "--status"], "remvol --check_share_name": ["remvol", "--check_share_name", "-s", "X"],
            "vvstat": ["vvstat"]}
TREE = ("nodes of the tree", "bytes of the settings file", "KiB that the tree's daemon has resident")
PEAK = "remvol --status, at most resident"  # varies too much from run to run to be computed


def counted(text, command, loads):
    """The shell commands and the requests to the tree of a run on a tree that was just loaded: the median of some, since a
    run looks again at what it knows when the clock's second changes."""
    counts = []
    for _ in range(loads):
        load(text)
        counts.append(traced(command))
    return map(statistics.median, zip(*counts))


def cost_of(targets, luns, folder, rounds, loads=3):
    """What is counted and timed with so many targets of so many LUNs, by name; the programs are those of the folder."""
    fake_iscsiadm(targets, luns)
    text = document(targets, luns)
    commands = {name: [folder / words[0], *words[1:]] for name, words in COMMANDS.items()}
    with one_processor(), ktree() as daemon:
        load(text)
        output(program("ktreec"), "-S", SOCKET, "-D", WORK / "scale.xml")
        settings = (WORK / "scale.xml").read_text()
        # The document's own element is none of the nodes.
        costs = dict(zip(TREE, (len(re.findall(r"<[a-z]", settings)) - 1, len(settings), resident(daemon))))
        for name, command in commands.items():
            costs[f"{name}, shell commands"], costs[f"{name}, requests to the tree"] = counted(text, command, loads)
        status, *quick = commands.items()
        (times,), (costs[PEAK],) = in_turn(rounds, status[1])
        costs[f"{status[0]}, milliseconds"] = statistics.median(times) / 1000
        # They take little longer than any start of a program, which is taken off.
        (*each, true), _ = in_turn(10 * rounds, *(command for _, command in quick), ["/bin/true"])
    for (name, _), times in zip(quick, each):
        costs[f"{name}, milliseconds over /bin/true"] = statistics.median(a - b for a, b in zip(times, true)) / 1000
    return {name: cost for name, cost in costs.items() if cost}


def cost_of_line(folder, rounds):
    """Milliseconds that a status takes longer for a further line of what iscsiadm says. They are few beside its other costs, so they
    are measured where the lines are many: the sessions of other targets, which are not stored, lie between those of its own."""
    targets, luns = SMALL[-1]
    others = TARGETS // targets - 1
    times, lines = [], []
    with one_processor(), ktree():
        load(document(targets, luns))
        for details in (sessions_in_detail(targets, luns), sessions_among_others(targets, luns, others)):
            fake_iscsiadm(targets, luns, details)
            (each,), _ = in_turn(rounds, [folder / "remvol", "--status"])
            times.append(statistics.median(each) / 1000)
            lines.append(targets * details.count("\n"))
    return (times[1] - times[0]) / (lines[1] - lines[0])


# ---- what is computed ----

@dataclasses.dataclass
class Size:
    """So many targets of so many LUNs, of at most so many."""
    targets: int
    each: int
    most_targets: int = constant(LAYOUT, "REMVOL_MAX_TARGETS")
    most_each: int = constant(LAYOUT, "REMVOL_MAX_LUNS_PER_TARGET")

    @property
    def luns(self):
        return self.targets * self.each

    @property
    def free_targets(self):
        return self.most_targets - self.targets

    @property
    def open_targets(self):
        """Those with a free slot for a LUN."""
        return self.targets if self.each < self.most_each else 0

    @property
    def lines(self):
        """Of iscsiadm's listing that a status reads: all, once for each target."""
        return self.targets * sessions_in_detail(self.targets, self.each).count("\n")

    def __str__(self):
        return f"{self.targets} × {self.each}"


def raised(targets, each):
    return Size(targets, each, TARGETS, LUNS)


def terms(name, size):
    """What a cost is made of. What is stored is read from the mirror; the first free slot behind it has to be asked for."""
    if "requests" in name:
        return 1, size.luns, size.free_targets, size.open_targets
    if name.startswith("remvol --check_share_name"):
        return 1, size.luns
    return 1, size.targets, size.luns


def solve(rows, values):
    """The least squares: the factors of the columns that give the values best."""
    size = len(rows[0])
    system = [[sum(row[i] * row[j] for row in rows) for j in range(size)] + [sum(row[i] * value for row, value in zip(rows, values))]
              for i in range(size)]
    for i in range(size):
        pivot = max(range(i, size), key=lambda line: abs(system[line][i]))
        system[i], system[pivot] = system[pivot], system[i]
        system[i] = [value / system[i][i] for value in system[i]]
        for line in range(size):
            if line != i:
                system[line] = [a - system[line][i] * b for a, b in zip(system[line], system[i])]
    return [line[-1] for line in system]


def computed(name, small, size, line):
    """The cost of a size from those of small ones; `line` is what a status pays for each line of the listing."""
    if name != "remvol --status, milliseconds":
        line = 0
    factors = solve([terms(name, each) for each, _ in small], [costs[name] - line * each.lines for each, costs in small])
    return sum(factor * term for factor, term in zip(factors, terms(name, size))) + line * size.lines


def deviation(guess, value):
    return 100 * (guess - value) / value


# ---- what is shown ----

def scale_table(small, large, line):
    size, measured = small[-1]
    rows = []
    for name in (name for name in measured if name != PEAK):
        row = [name, number(measured[name])]
        for each, costs in large:
            guess = computed(name, small, each, line)
            row.append(f"{number(guess)}, {number(costs[name])} ({deviation(guess, costs[name]):+.1f} %)")
        rows.append(row)
    heads = [f"{each}: computed, simulated" for each, _ in large]
    return Table(
        "What a larger appliance would cost", ["targets × LUNs of each", f"{size}, measured", *heads], rows,
        f"""Computed from what {len(small)} sizes up to {size} cost: what is fixed, and what each target, each LUN and each free slot that
is looked at adds (least squares); a line of `iscsiadm`, which a status reads, adds {number(line * 1000)} us.
Simulated: measured in the same way, with a build of its own whose limits are raised to {TARGETS} targets of {LUNS} LUNs; the disks are
not there, and what `iscsiadm` says of them is a file.""")


def counts_deviation(small, large, line):
    found = [(abs(deviation(computed(name, small, size, line), costs[name])), f"{name}, {size}")
             for size, costs in large for name in costs if not re.search("milliseconds|resident", name)]
    worst, where = max(found)
    return Figure("Scale", "a computed count beside the simulated one, at most", worst, MOST_COUNT, "%", detail=where)


def settled_seconds(*names):
    return sum(wait.seconds for wait in SETTLED if wait.name in names)


def section_of(share):
    return f"[{share}]\n\tpath = /mnt/VV/{share}\n\tread only = no\n\tvfs objects = catia fruit streams_xattr\n"


def limits_table(small):
    luns = TARGETS * LUNS
    last_disk = disk_of(TARGETS, LUNS)
    layout, tree, record = LAYOUT, "platform/ktree/limits.h", "src/tree/record.h"
    nodes, size = (computed(name, small, raised(*LARGE[-1]), 0) for name in TREE[:2])
    sections = sum(len(section_of(f"volume{n}-{m}")) for n in range(1, TARGETS + 1) for m in range(1, LUNS + 1))
    disk_field = int(re.search(r"char dev\[(\d+)\]", (TOP / record).read_text()).group(1))
    start, stop = settled_seconds("the disks of a new session"), settled_seconds("users of a volume end")
    recover = settled_seconds("a remount shows", "a format or a resize shows")
    rows = [
        ["targets", f"`{layout}`", constant(layout, "REMVOL_MAX_TARGETS"), TARGETS, "all walks over slots have their end from here"],
        ["LUNs of a target", f"`{layout}`", constant(layout, "REMVOL_MAX_LUNS_PER_TARGET"), LUNS, "the same"],
        ["LUNs in all", f"`{layout}`", constant(layout, "REMVOL_MAX_LUNS"), luns,
         "`--add` refuses a further one; a tree that has more is served, as the 64 here"],
        ["targets that wait for recovery", f"`{layout}`", constant(layout, "kMaxRecoverQueue"), TARGETS, ""],
        ["nodes of the tree", f"`{tree}`", constant(tree, "kMaxNodes"), round(nodes), ""],
        ["names and values in it, bytes", f"`{tree}`", constant(tree, "kMaxTreeBytes"), round(size), "needed: less than its whole document"],
        ["children of one name", f"`{tree}`", constant(tree, "kMaxNumber"), max(TARGETS, LUNS), ""],
        ["runs that ask the tree at once", "`platform/ktree/ktree_main.cpp`", constant("platform/ktree/ktree_main.cpp", "kMaxClients"),
         TARGETS, "a recovery of each target; half as many as the daemon may have files, when that is less"],
        ["characters of a disk's name", f"`{record}`", disk_field - 1, len(last_disk), f"the last one is {last_disk}"],
        ["mounts below /mnt/VV", "the kernel's fs.mount-max", int(pathlib.Path("/proc/sys/fs/mount-max").read_text()), luns,
         "one a volume; vvstat and each look at a mount point go through the table of all"],
        ["bytes of Samba's sections", "`platform/shares/share_file.cpp`", constant("platform/shares/share_file.cpp", "kMaxText"), sections,
         "without users; a list of users may be 900 bytes a share, which many of so many shares may not have"],
        ["sessions of iscsid", "none", "", TARGETS, "each a connection and a SCSI host; one daemon looks after all"],
        ["lines of `iscsiadm` that a status reads", "none", "", raised(TARGETS, LUNS).lines, "the listing of all sessions, once for each target"],
        ["seconds of settled waits of a start", "none", "", round(start * TARGETS), f"{number(start)} s for each target, one after the other"],
        ["of a disconnection of all", "none", "", round(stop * luns), f"{number(stop)} s for each volume, one after the other"],
        ["of a recovery of all", "none", "", round(recover * luns),
         f"{number(recover)} s for each volume, one target after the other: of all costs the one to mend first"],
        ["formats at once", "the format semaphore", 1, luns, "one after the other, whatever is asked for at once"],
    ]
    text = [[number(cell) if isinstance(cell, int) else cell for cell in row] for row in rows]
    return Table("What limits an appliance", ["what", "where", "limit", f"{TARGETS} targets and {number(luns)} LUNs need", ""], text,
                 "The limits stand in the sources named, from which these numbers are read; what has none costs time.")


def scale(short):
    product = pathlib.Path(program("remvol")).parent
    if short:
        line = cost_of_line(product, 3)
        small = [(Size(*size), cost_of(*size, product, 3, loads=1)) for size in SMALL[1::2]]
        large = [(Size(8, 6), cost_of(8, 6, product, 3, loads=1))]
    else:
        line = cost_of_line(product, 41)
        small = [(Size(*size), cost_of(*size, product, 31)) for size in SMALL]
        programs = installed()
        large = [(raised(*size), cost_of(*size, programs, 11)) for size in LARGE]
    yield limits_table(small)
    yield scale_table(small, large, line)
    yield counts_deviation(small, large, line)
    size, costs = large[-1]
    yield Figure("Memory", f"{PEAK}, {size.targets} targets and {number(size.luns)} LUNs", costs[PEAK], MOST_KIB, "KiB")
