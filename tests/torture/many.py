"""Many runs at once against one tree, with deaths among them: nothing is lost, doubled or mixed up."""

import dataclasses
import heapq
import random
import time

import judge
from world import FLASH, INITIATOR, LONG, SAVED, World

WEIGHTS = {"add": 16, "connect": 13, "disconnect": 5, "del": 4, "del_lun": 5, "format": 6, "modify": 3, "status": 8,
           "check_share_name": 3, "recover": 3}
RUNS, RESTARTS, KILL_ONE_IN = 64, 2, 50
WINDOW = 2.0  # seconds in which the runs begin


@dataclasses.dataclass
class Plan:
    seed: int
    events: list  # (second, kind, details)


def plan(seed, runs=RUNS):
    dice = random.Random(seed)
    commands = dice.choices(list(WEIGHTS), list(WEIGHTS.values()), k=runs)
    events = []
    for command in commands:
        t, l = dice.randint(1, 8), dice.choice([0, 0, 0, 1, 1, 2])
        share = dice.choice([f"v{t}{l}"] * 3 + [f"c{dice.randint(1, 3)}"])
        at = dice.random() * WINDOW
        death = (dice.random() * 0.6, dice.random() < 0.5) if dice.randrange(KILL_ONE_IN) == 0 else None
        events.append((at, "run", (command, t, l, share, death)))
    events += [(dice.random() * WINDOW * 1.5, "restart", dice.choice([0.02, 0.1, 0.2])) for _ in range(RESTARTS)]
    return Plan(seed, sorted(events, key=lambda event: event[0]))


# What a command is given; the others take nothing.
TAKES = {"add": ("t", "l", "share"), "del_lun": ("t", "l"), "format": ("t", "l"), "connect": ("t",), "del": ("t",), "modify": ("t",),
         "check_share_name": ("share",)}


def start_run(world, dice, command, t, l, share):
    if command == "recover":  # the listener says one thing at a time
        world.tool("oiscsi_evt_reopen", t=t)
        if dice.random() < 0.7:
            degrade_one(world, t)
        return world.begin("oiscsi_evt_recover", t=t)
    if command == "disconnect":
        return world.begin(command, **({"t": t} if dice.random() < 0.85 else {}))
    given = {"t": t, "l": l, "share": share}
    return world.begin(command, **{name: given[name] for name in TAKES.get(command, ())})


def degrade_one(world, t):
    """A volume of the target turns read-only, when one is mounted."""
    for point in world.mounts():
        try:
            if (world.box.path(point) / ".data").read_text().startswith(f"{t} "):
                return world.degrade(point.rsplit("/", 1)[1])
        except (OSError, RuntimeError):
            continue  # it has just been unmounted


class Round:
    def __init__(self, seed, runs=RUNS, restarts=True):
        self.seed, self.plan, self.restarts = seed, plan(seed, runs), restarts
        self.dice = random.Random(seed + 1)
        self.downtimes = []
        self.findings = []

    def play(self):
        with World() as self.world:
            self.furnish()
            self.storm()
            self.world.settle()
            self.after()
            found = self.findings + self.world.findings()
            if found:
                self.record()
        return found

    def furnish(self):
        """Four stored targets, two of them connected, one with data on two LUNs."""
        world = self.world
        world.offer({t: [0, 1, 2] for t in range(1, 9)})
        world.tool("init")
        for t, l in ((1, 0), (1, 1), (2, 0), (3, 0)):
            world.tool("add", t=t, l=l, share=f"v{t}{l}")
        for t in (1, 2):
            world.tool("connect", t=t)
        bad = [str(job) for job in world.jobs if job.status != 0]
        if bad or world.findings():
            raise RuntimeError(f"the beginning failed: {bad} {world.findings()}")

    def storm(self):
        begin = time.monotonic()
        queue = [(at, number, kind, details) for number, (at, kind, details) in enumerate(self.plan.events)]
        heapq.heapify(queue)
        number = len(queue)
        while queue:
            at, _, kind, details = heapq.heappop(queue)
            self.world.pump(max(0.001, begin + at - time.monotonic()))
            if kind == "run":
                *what, death = details
                job = start_run(self.world, self.dice, *what)
                if death:
                    number += 1
                    heapq.heappush(queue, (at + death[0], number, "kill", (job, death[1])))
            elif kind == "kill":
                self.world.kill(*details)
            elif self.restarts:
                self.restart(details)

    def restart(self, pause):
        began = time.monotonic()
        self.world.kill_daemon()
        self.world.pump(pause)
        self.world.start_daemon()
        self.downtimes.append((began, time.monotonic()))

    # --- afterwards ---

    def check(self, text):
        self.findings.append(text)

    def after(self):
        world = self.world
        status = world.tool("status")
        if status.status != 0:
            self.check(f"status: {status}: {status.output}")
        tree, state = world.tree(), world.state()
        self.findings += judge.tree_findings(tree, state, self.offered_shares(), self.unfinished())
        killed = any(job.killed for job in world.jobs)  # between an unmount and the removal of the folder
        self.findings += [text for text in judge.disk_findings(world) if not (killed and text.startswith("left-over: the folder"))]
        self.findings += judge.settings_findings(world)
        self.findings += judge.lock_findings(world)
        self.findings += self.ledger(tree)
        self.all_well()

    def offered_shares(self):
        shares = {}
        for job in self.world.jobs:
            if job.command == "add":
                shares.setdefault((job.t, job.l), set()).add(job.share)
        return shares

    def unfinished(self):
        """Targets of which an add was refused or killed: such a one stays without a LUN until the next add."""
        return {job.t for job in self.world.jobs if job.command == "add" and job.status != 0}

    def disturbed(self, job):
        """The daemon went away during the run: what the run then says is judged apart."""
        return any(job.began < back and job.ended > gone for gone, back in self.downtimes)

    def deletions(self, t, l):
        return [job for job in self.world.jobs if job.t == t and (job.command == "del" or (job.command == "del_lun" and job.l == l))]

    def ledger(self, tree):
        """Who was told what, against what is there."""
        wrong, there = [], judge.volumes(tree)
        adds = [job for job in self.world.jobs if job.command == "add"]
        good = [job for job in adds if job.status == 0]
        for job in good:
            gone = [d for d in self.deletions(job.t, job.l) if d.ended >= job.began and (d.status in (0, 2) or d.killed or d.status == 255)]
            if there.get((job.t, job.l), ("",))[0] != job.share and not gone:
                kind = "lost-by-restart" if self.disturbed(job) else "lost"
                wrong.append(f"{kind}: {job} and there is {there.get((job.t, job.l))}")
        for i, one in enumerate(good):
            for two in good[i + 1:]:
                same = (one.t, one.l) == (two.t, two.l)
                if not same and one.share != two.share:
                    continue
                gone = [d for d in self.deletions(one.t, one.l) + self.deletions(two.t, two.l)
                        if d.ended >= one.began and d.began <= two.ended]
                if not gone:
                    kind = "both-by-restart" if self.disturbed(one) or self.disturbed(two) else "both"
                    wrong.append(f"{kind}: {one} and {two}")
        for (t, l), (share, n, m) in there.items():
            for job in self.deletions(t, l):
                later = [a for a in adds if (a.t, a.l) == (t, l) and a.ended >= job.began]
                if job.status == 0 and not later:
                    kind = "back-by-restart" if self.disturbed(job) else "back"
                    wrong.append(f"{kind}: {job} and slot {n}/{m} is there")
        return wrong

    def all_well(self):
        """Every target that is stored can be connected, shows its data, and can be left again."""
        world = self.world
        stored = sorted({t for t, _ in judge.volumes(world.tree())})
        for t in stored:  # one that is read-only is not, once it was unmounted
            world.tool("disconnect", t=t)
            job = world.tool("connect", t=t)
            if job.status != 0:
                self.check(f"unwell: {job}: {job.output[-800:]}")
        for n, (keys, luns) in judge.slots(world.tree()).items():
            said = [keys.get("status"), *(lun.get("status") for lun in luns.values())]
            if luns and said != ["Connected"] + ["Running"] * len(luns):
                self.check(f"unwell: slot {n} says {said} after every target was connected")
        self.findings += [f"{text} (at the end)" for text in judge.disk_findings(world)]
        for t in stored:
            job = world.tool("disconnect", t=t)
            if job.status != 0:
                self.check(f"unwell: {job}: {job.output[-800:]}")
        if world.mounts():
            self.check(f"unwell: mounted after every target was disconnected: {world.mounts()}")

    def record(self):
        """What a person needs to understand a finding."""
        zero = self.world.jobs[0].began
        lines = [f"{job.began - zero:8.3f} {job.ended - zero if job.ended else -1:8.3f} {job}" for job in self.world.jobs]
        lines += [f"daemon away {gone - zero:.3f} to {back - zero:.3f}" for gone, back in self.downtimes]
        lines += ["\t".join(entry) for entry in self.world.log()]
        lines += [f"{path}={value}" for path, value in self.world.tree().items()]
        for job in self.world.jobs:
            lines += [f"--- {job}", job.output]
        self.story = "\n".join(lines)
