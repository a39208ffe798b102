"""Every fault: each call, tree call, command and allocation of each road fails once, or that one and all later ones.

After a fault: no crash, no hang, no success that is none; and the same command again, without the fault, ends as if
nothing had happened (beside a run that never had a fault). What is settled otherwise stands in settled.py."""

import collections
import dataclasses
import errno
import json
import multiprocessing
import os
import pathlib
import re
import time
import zlib

import settled
from pairs import beginning
from roads import FOUND, ROADS
from world import SAVED, World

CALL, TREE, COMMAND, MEMORY, SYSTEM = range(5)
CLASSES = ("call", "tree", "command", "memory", "system call")
# They do not fail, or nothing is left that could take notice; a descriptor is closed whatever close(2) says, and a child of
# one's own is waited for.
UNFAILING = "close wait4 exit exit_group rt_sigreturn restart_syscall arch_prctl set_tid_address set_robust_list rseq".split()
INJECTED = "/tmp/injected"
STRACE = ["strace", "-f", "-b", "execve", "-qq", "-o", INJECTED]  # not what it starts: that is made up, and fails as a whole
FAIL, KILL, NOTHING, MUTE, LATE = range(5)
KINDS = ("fails", "is killed", "does nothing and says 0", "prints nothing", "works and says 1")
EIO, ENOMEM, ENOSPC, EMFILE = 5, 12, 28, 24
ERRORS = (EIO, ENOSPC, EMFILE)
SYSTEM_ERRORS = (*ERRORS, ENOMEM)
PACE = 5  # percent: nobody meets anybody here
HANG = 30  # seconds


@dataclasses.dataclass(frozen=True)
class Fault:
    road: str
    kind_of: int
    index: int
    forever: bool
    kind: int
    error: int
    name: str
    subject: str

    def __str__(self):
        what = f"{self.road}: {CLASSES[self.kind_of]} {self.index} ({self.name} {self.subject})".replace("\t", " ")
        return f"{what[:200]} {KINDS[self.kind]}{' for ever' if self.forever else ''}, errno {self.error}"

    @property
    def killed(self):
        return self.kind == KILL and self.kind_of != COMMAND

    def key(self):
        what = f"{self.index}.{self.name}" if self.kind_of == SYSTEM else self.index
        return f"{self.road}/{self.kind_of}/{what}/{int(self.forever)}/{self.kind}/{self.error}"


# --- what is there afterwards ---

def picture(world):
    """Everything that lasts, with the disks under the names of their LUNs."""
    state = world.state()
    names = {lun.dev: f"<{t}.{l}>" for t, (_, _, _, luns) in state.items() for l, lun in enumerate(luns) if lun.dev}

    def plain(text):
        return re.sub(r"\bsd[b-z](?=1?\b)", lambda m: names.get(m[0], "<gone>"), text)

    now = world.dump()
    tree = world.tree() if now else {}  # in which an empty value is as good as none
    seen = {"daemon": "there" if now else "gone"}
    seen |= {f"tree {path}": plain(value) for path, value in tree.items() if value and not path.startswith("/result")}
    for t, (online, record, _, luns) in state.items():
        if record or online:
            seen[f"target {t}"] = f"online={online} record={record}"
        for l, lun in enumerate(luns):
            if lun.parts:
                seen[f"disk {t}.{l}"] = f"content={lun.content}"
    for point, sources in world.mounts().items():
        seen[f"mount {point}"] = plain(" ".join(sources))
    folder = world.box.path("/mnt/VV")
    for entry in folder.iterdir() if folder.exists() else ():
        seen[f"folder {entry.name}"] = ""
    saved = world.box.path(SAVED)
    text = without_results(saved.read_bytes()) if saved.exists() else "none"
    # Without the tree, whose --status refreshes them, the names of disks are those of some time.
    seen["settings"] = plain(text) if now else re.sub(r"\bsd[b-z](?=1?\b)", "<disk>", text)
    seen["now"] = plain(without_results(now))
    found = world.box.path(FOUND)
    if found.exists():
        seen["found"] = found.read_text("utf-8", "surrogateescape")
    return seen


def without_results(data):
    text = data.decode("utf-8", "surrogateescape")
    return re.sub(r"(?s)<result>.*?</result>\s*|<result/>\s*", "", text)


def difference(good, seen, output=""):
    texts = []
    for key in sorted(good.keys() | seen.keys()):
        if good.get(key) == seen.get(key) or (good["daemon"] != seen["daemon"] and key.startswith(("tree ", "settings"))):
            continue
        if key == "settings":
            if seen[key] != seen["now"]:  # else it is the tree that differs
                said = re.search(r"(?m)^(\(|remvol: ).*(dump|saved|settings|vv\.xml|is kept as it is)", output)
                texts.append(f"settings differ{' (said)' if said else ''}")
        elif key != "now":
            texts.append(f"{key}: {seen.get(key)} for {good.get(key)}")
    return texts


# --- what became of the states that faults leave ---

@dataclasses.dataclass
class Outcome:
    seen: dict  # the picture of the state itself
    later: list  # what was found when the command was given again from there


class Outcomes:
    """Faults leave the same few states again and again. From the same state the same commands lead to the same end,
    so each is gone on from once, by whichever process meets it first; one in CHECKED again, to see that it is so."""

    CHECKED = 40

    def __init__(self, folder):
        self.folder = pathlib.Path(folder)
        self.checks = 0

    def of(self, road, state):
        """The outcome that is known, None when there is none or it is to be found once more."""
        file = self.folder / f"{road}.{state}"
        if state is None or not file.exists():
            return None
        return Outcome(**json.loads(file.read_text()))

    def due(self):
        self.checks += 1
        return self.checks % self.CHECKED == 0

    def keep(self, road, state, outcome):
        if state is None:
            return
        draft = self.folder / f"draft.{os.getpid()}"
        draft.write_text(json.dumps(dataclasses.asdict(outcome)))
        draft.rename(self.folder / f"{road}.{state}")


# --- one road, with a fault or without ---

class Walk:
    def __init__(self, name, beginning):
        self.name, self.beginning = name, beginning

    @property
    def road(self):
        return ROADS[self.name]

    def world(self):
        world = World(pace=PACE, daemon=False)
        world.restore(self.beginning)
        if self.road.unit:
            world.start_daemon()
        if self.road.degraded:
            world.degrade(self.road.degraded)
        return world

    def begin(self, world):
        for command, options in self.road.before:
            world.tool(command, **options)

    def repeat(self, world):
        self.give(world, "status")  # the platform asks for it all the time
        self.begin(world)
        for command, options in (self.road.command, *self.road.heal, ("status", {})):
            self.give(world, command, **options)
        world.box.wait_quiet()

    def give(self, world, command, **options):
        """One more command; who has ended the tree's daemon finds it started again, as its unit is."""
        if self.road.ends_tree and not world.answers():
            world.start_daemon()
        world.tool(command, **options)

    def clean(self):
        """The pictures after one run and after the repetition, and the calls of the run."""
        with self.world() as world:
            self.begin(world)
            world.plan(traced=1)
            command, options = self.road.command
            done = world.tool(command, **options)
            world.plan(active=0)
            world.box.wait_quiet()
            if done.status != self.road.status or world.findings():
                raise RuntimeError(f"{self.name} fails without a fault: {done} {done.output} {world.findings()}")
            self.first = picture(world)
            calls = (world.box.root / "fake/world/calls").read_text("utf-8", "replace").splitlines()
            self.repeat(world)
            self.second = picture(world)
            if world.findings():
                raise RuntimeError(f"{self.name}: {world.findings()}")
        return [line.split("\t", 3) for line in calls]

    def system_calls(self):
        """What clean() tells of the calls, below the C library: those of a kind that any one process made, the tool or
        one that is to become what it starts."""
        with self.world() as world:
            self.begin(world)
            command, options = self.road.command
            job = world.begin(command, under=STRACE, **options)
            job.running.wait(HANG)
            job.ended = time.monotonic()
            world.box.wait_quiet()
            text = world.box.path(INJECTED).read_text("utf-8", "replace")
        made = re.compile(r"(?m)^(\d+) +(\w+)\(")
        # What comes before is the loader's, which crashes without memory.
        loaded = collections.Counter(name for _, name in made.findall(text[:text.index("/fake/world/state")]))
        most = {}
        for (_, name), number in collections.Counter(made.findall(text)).items():
            most[name] = max(number, most.get(name, 0))
        return [(SYSTEM, index, name, "") for name in sorted(most.keys() - set(UNFAILING))
                for index in range(loaded[name] + 1, most[name] + 1)]

    def suffer(self, fault, outcomes):
        """What is wrong after one fault and not settled; None when it was never met."""
        with self.world() as world:
            self.begin(world)
            job, fired = self.run(world, fault)
            if job.status is None:
                return [f"hang: {job.output[-500:]}"]
            if not fired:
                return None
            world.box.wait_quiet()
            job.killed = fault.killed
            found = world.findings()
            outcome = self.outcome(world, outcomes)
            if job.status == 0 != self.road.status:
                found.append(f"success: result 0 for {self.road.status}")
            if job.status in (0, self.road.status):
                found += [f"success: {text}" for text in difference(self.first, outcome.seen, job.output)]
            return [text for text in found + outcome.later if not settled.reason(fault, text, job.output)]

    def run(self, world, fault):
        """Runs the road's command with the fault. Gives the run, and whether the fault was met."""
        under = ()
        if fault.kind_of == SYSTEM:
            when = f"{fault.index}{'+' if fault.forever else ''}"
            effect = "signal=KILL" if fault.kind == KILL else f"error={errno.errorcode[fault.error]}"
            under = [*STRACE, "-e", f"trace={fault.name}",
                     "-e", f"inject={fault.name}:{effect}:when={when}"]
        else:
            world.plan(kind_of=fault.kind_of, index=fault.index, forever=fault.forever, kind=fault.kind, error=fault.error)
        command, options = self.road.command
        job = world.begin(command, under=under, **options)
        try:
            job.running.wait(HANG)
        except TimeoutError:
            pass
        fired, _ = world.faults()
        world.plan(active=0)
        job.ended = time.monotonic()
        if fault.kind_of == SYSTEM:
            injected = world.box.path(INJECTED)
            text = injected.read_text("utf-8", "replace")
            fired = "INJECTED" in text or "SIGKILL" in text
            injected.unlink()
        return job, fired

    def outcome(self, world, outcomes):
        """What the state is, and what the same command makes of it."""
        state = world.lasting()
        known = outcomes.of(self.name, state)
        if known and not outcomes.due():
            return known
        seen, before = picture(world), world.findings()
        later = []
        try:
            self.repeat(world)
            later += [f"after: {text}" for text in difference(self.second, picture(world))]
        except TimeoutError as late:
            later += [f"hang: afterwards {late}"]
        later += [text for text in world.findings() if text not in before]
        if known and (seen, later) != (known.seen, known.later):
            later += [f"unsteady: the same state ended otherwise before: {known.later}"]
        outcome = Outcome(seen, later)
        if not known:
            outcomes.keep(self.name, state, outcome)
        return outcome


def draw(seed, *words):
    """A number that depends on these words alone, not on what was drawn before."""
    return zlib.crc32("/".join(map(str, (seed, *words))).encode())


def possible(road, calls, seed):
    """Every fault of a road; the error of a failing call is drawn by the seed."""
    for kind_of, index, name, subject in calls:
        kind_of, index = int(kind_of), int(index)

        def fault(forever, kind, error=EIO):
            return Fault(road, kind_of, index, forever, kind, error, name, subject)

        if kind_of == COMMAND:
            for kind in (FAIL, KILL, NOTHING, MUTE, LATE):
                yield fault(False, kind)
            yield fault(True, FAIL)
        elif kind_of == MEMORY:
            yield fault(False, FAIL, ENOMEM)
            yield fault(True, FAIL, ENOMEM)
        else:
            errors = SYSTEM_ERRORS if kind_of == SYSTEM else ERRORS
            for forever in (False, True):
                yield fault(forever, FAIL, errors[draw(seed, road, kind_of, index, forever) % len(errors)])
            yield fault(False, KILL)


def walk_clean(name, below):
    """A road's walk, and the calls on it."""
    road = ROADS[name]
    walk = Walk(name, road.beginning(beginning(*road.furnish)[0]))
    calls = walk.clean()
    return walk, walk.system_calls() if below else calls


class Faults:
    """All roads: their clean walks, and the list of what can fail, in the C library or `below` it."""

    def __init__(self, only="", seed=1, jobs=2, below=False):
        names = [name for name in ROADS if only in ("", name)]
        with multiprocessing.Pool(jobs) as pool:
            walked = dict(zip(names, pool.starmap(walk_clean, [(name, below) for name in names], chunksize=1)))
        self.seed = seed
        self.walks = {name: walk for name, (walk, _) in walked.items()}
        self.all = [fault for name, (_, calls) in walked.items() for fault in possible(name, calls, seed)]

    def order(self, fault):
        """Where a fault stands among all: the same in every run, whatever else is chosen."""
        return draw(self.seed, fault.key())

    def play(self, fault, outcomes):
        return self.walks[fault.road].suffer(fault, outcomes)
