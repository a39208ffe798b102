"""Where the time goes that a person waits for, in the virtual appliance.

Each command runs there with bench/waits/meter.cpp in front of its libraries, which books every call by which the tool
waits, runs a program, asks the tree, looks at a disk or calls the kernel. What is left is the tool's own: the time that its
process had the processor is ours; in the rest of it the kernel let it stand (a page, a turn of another process).
"""

import collections
import dataclasses
import os
import pathlib
import shutil

from figures import Figure, Table, number
from road import in_appliance
from settled_waits import SETTLED, name_of

TOP = pathlib.Path(__file__).resolve().parent.parent
STAGE = TOP / "build/bench-meter"  # what the scenario brings into the appliance
MOST = 3  # % of a command's time, the goal


@dataclasses.dataclass
class Run:
    """One run of a command. Times are in seconds; together they are the total."""
    name: str
    total: float
    start: float  # until the libraries were loaded, and after the end of main
    waits: float
    programs: float
    tree: float
    disks: float
    kernel: float
    ours: float
    named: dict  # seconds of the waits by their names

    @property
    def share(self):
        return 100 * self.ours / self.total

    def judged(self):
        """Its share, and whether that is within the goal."""
        return Figure("", "", self.share, MOST, "%").measured


def parse(text):
    """The runs that a report of the meter tells of."""
    runs = []
    for line in text.splitlines():
        word, _, rest = line.partition(" ")
        if word == "run":
            name, command, named, spent, alive = rest, "", collections.Counter(), {}, None
        elif word == "program":
            command = rest
        elif word == "wait":
            call, length = rest.split()
            named[name_of(call, command)] += int(length) / 1e9
        elif word == "spent":
            account, clock, processor = rest.split()
            spent[account] = int(clock) / 1e9, int(processor) / 1e9
        elif word == "alive":
            alive = [int(value) / 1e9 for value in rest.split()]
        elif word == "around":
            begin, end, status = rest.split()
            if alive is None:
                raise ValueError(f"{name}: the meter said nothing (status {status})")
            start = (int(end) - int(begin)) / 1e9 - (alive[1] - alive[0])
            waits, programs, tree, disks, kernel = (spent[each][0] for each in ("waits", "programs", "tree", "disks", "kernel"))
            own, ours = spent["own"]
            total = (int(end) - int(begin)) / 1e9 - spent["meter"][0]
            runs.append(Run(name, total, start, waits, programs, tree, disks, kernel + own - ours, ours, named))
    return runs


def medians(runs):
    """Of the runs of each command the one whose total is the median."""
    by_name = {}
    for run in runs:
        by_name.setdefault(run.name, []).append(run)
    return [sorted(same, key=lambda run: run.total)[len(same) // 2] for same in by_name.values()]


def measured():
    STAGE.mkdir(parents=True, exist_ok=True)
    build = pathlib.Path(os.environ["REMVOL_BUILD"])
    for name in ("bench_meter", "bench_meter.so"):
        shutil.copy(build / "bin" / name, STAGE)
    said = in_appliance("bench/waits/waits.sh")
    _, found, times = said.partition("---- times\n")
    if not found:
        raise RuntimeError(f"the appliance said:\n{said}")
    return parse(times)


def cell(value):
    return number(value) if value >= 0.0005 else "0"


def time_table(runs):
    rows = [[run.name, *(cell(value) for value in (run.total, run.waits, run.programs, run.tree, run.disks, run.kernel, run.start,
                                                   run.ours)), run.judged()] for run in runs]
    return Table(
        "Where a person's time goes", ["command", "seconds", "waits", "programs", "tree", "disks", "kernel", "start", "ours", "share of ours"],
        rows, f"""Of each command the run whose time is the median, in the virtual appliance (QEMU's software emulation, one processor). *Waits* are
those that the tool asks for, *programs* those that it runs, by a shell; *tree* is the time in the tree's library and its daemon, *disks*
that in `libsysaux`, *kernel* the calls of the kernel that the tool makes itself (files, locks) and the time that the kernel lets it
stand, *start* what the kernel and the loader need before the tool's first instruction and after its last. *Ours* is all that is left
of the processor's time, with the faults of the tool's pages and what interrupts do meanwhile; the goal is at most {MOST} % of the command.""")


def wait_table(runs):
    def seen(wait):
        found = [(run.name, run.named[wait.name]) for run in runs if run.named.get(wait.name)]
        return ", ".join(f"{name} {cell(seconds)} s" for name, seconds in found)

    rows = [[wait.name, ", ".join(f"`{file}`" for file in wait.files), wait.length, wait.why, wait.instead, seen(wait)] for wait in SETTLED]
    return Table(
        "Settled waits", ["what for", "where", "how long", "why it stood", "the look that would do", "in the runs above"], rows,
        """They are seen from outside and stay as they are; beside each stands what could be asked in its place.""")


def waits():
    runs = medians(measured())
    yield time_table(runs)
    most = max(runs, key=lambda run: run.share)
    yield Figure("In the appliance", "what is ours of the time of a command, at most", most.share, MOST, "%",
                 detail=f"{most.name}, {cell(most.ours)} of {cell(most.total)} s; all are under \"Where a person's time goes\"")
    yield Figure("In the appliance", "what is ours of the time of all of them together",
                 100 * sum(run.ours for run in runs) / sum(run.total for run in runs), unit="%")
    yield wait_table(runs)
