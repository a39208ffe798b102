"""Many runs at once, as in many.py, on real disks: an appliance with eight targets of a real tgt, real sessions,
partitions and file systems. Each round begins with the same disks, whose data says whose it is; what the runs may have
done to them is looked at in the files that the LUNs are made of."""

import base64
import collections
import pathlib
import random
import shlex
import tempfile
import time

import judge
import many
from machine import Appliance, Dead, first_seed, lab, prepare
from world import FLASH, SAVED, Job, arguments, unit_commands

TARGETS = range(1, 9)
DISKS = [(t, l) for t in TARGETS for l in (1, 2)]
BLANK = {(t, 2) for t in (5, 6, 7, 8)}  # nobody has written to them when a round begins
STORED = ((1, 1), (1, 2), (2, 1), (3, 1))
CONNECTED = (1, 2)
ROUNDS_A_LIFE = 5
BOOT_SECONDS = 12  # of a machine that has a processor for itself, its targets included
WINDOW = 8.0  # seconds in which the runs begin
# Runs that end whoever uses a target's disks (fuser -mk), and those that have a disk open for a moment now and then: they
# may be ended with the others.
END_USERS = ("disconnect", "del", "del_lun", "oiscsi_evt_recover")
OPEN_DISKS = ("format", "connect", "add", "modify", "oiscsi_evt_recover")
PATIENCE = 300  # seconds for all of them, where the boot took BOOT_SECONDS

Disk = collections.namedtuple("Disk", "dev stamp")


def plan(seed, runs):
    """(second, kind, details), as many.plan draws them."""
    dice = random.Random(seed)
    commands = dice.choices(list(many.WEIGHTS), list(many.WEIGHTS.values()), k=runs)
    events = []
    for number, command in enumerate(commands, 1):
        t, l = dice.randint(1, 8), dice.choice([1, 1, 1, 2])
        share = dice.choice([f"v{t}{l}"] * 3 + [f"c{dice.randint(1, 3)}"])
        at = dice.random() * WINDOW
        events.append((at, "run", (number, command, t, l, share, dice.random() < 0.85)))
        if dice.randrange(many.KILL_ONE_IN) == 0:
            events.append((at + dice.random() * 10, "end", (number, dice.random() < 0.5)))
    events += [(dice.random() * WINDOW * 1.5, "restart", dice.choice([0.05, 0.3, 1])) for _ in range(many.RESTARTS)]
    return sorted(events, key=lambda event: event[:2])


class Run(Job):
    """A run that was begun in the appliance; it has a status when it was asked for its end."""
    ending, text = None, ""

    @property
    def status(self):
        return self.ending

    @property
    def output(self):
        return self.text


class Machine:
    """What the judge asks for, of the appliance."""

    def __init__(self, appliance, stamp):
        self.appliance, self.stamp = appliance, stamp
        self.jobs, self.wrong = [], []
        self.formatted = set()  # disks that somebody was asked to format
        self.shown = None

    def ask(self, line, may_fail=False):
        status, text = self.appliance.ask(line)
        if status != 0 and not may_fail:
            self.wrong.append(f"torture: '{line[:100]}' gave {status}: {text[-500:]}")
        return text

    def job(self, command, t=None, l=None, share=None):
        job = Run(len(self.jobs) + 1, command, t, l, share, arguments(command, t, l, share))
        self.jobs.append(job)
        return job

    def line(self, job):
        words = shlex.join(["remvol", *job.words])
        return f"sh -c {shlex.quote(words.replace('_recover', '_reopen') + '; exec ' + words)}" if "evt" in job.command else words

    def tool(self, command, **options):
        """One run that is waited for."""
        job = self.job(command, **options)
        self.shown = None
        job.began = float(self.ask("now")) / 100
        job.ending, job.text = self.appliance.ask(f"({self.line(job)})")
        job.ended = float(self.ask("now")) / 100
        return job

    def together(self, jobs):
        """Runs that are begun at once and waited for."""
        self.play([f"begin {job.number} {self.line(job)}" for job in jobs], many.LONG)

    # --- a round ---

    def play(self, lines, seconds):
        """Plays a round and waits for its end; its runs are told of it."""
        self.shown = None
        script = base64.b64encode("\n".join(lines).encode()).decode()
        self.ask(f"echo {script} | base64 -d >/tmp/round; storm")
        end = time.monotonic() + seconds * self.appliance.pace
        while (left := self.ask("under_way").strip()) and time.monotonic() < end:
            time.sleep(0.5)
        if left:
            self.wrong.append(f"hang: after {seconds * self.appliance.pace:.0f} s there is still {left}\n"
                              + self.ask("ps -ef; cat /proc/locks; ipcs -s; cat /proc/[0-9]*/stack", may_fail=True))
        self.seen, self.downtimes = set(), []
        ended = {}
        for kind, *words in map(str.split, self.ask("over", may_fail=True).splitlines()):
            if kind == "end":
                ended[int(words[0])] = [int(word) for word in words[1:]]
            elif kind == "down":
                self.downtimes.append(tuple(int(word) / 100 for word in words))
            elif kind == "seen":
                self.seen.add((words[0], int(words[1]), int(words[2])))
        texts = collections.defaultdict(list)
        for line in self.ask("said", may_fail=True).splitlines():
            number, _, text = line.partition(".out: ")
            texts[int(number)].append(text)
        for job in self.jobs:
            if job.number in ended:
                began, done, status = ended[job.number]
                job.began, job.ended = began / 100, done / 100
                job.ending = 128 - status if 128 < status < 160 else status
                job.text = "\n".join(texts[job.number])
        return ended

    # --- what is there ---

    def report(self):
        if self.shown is None:
            self.shown = Report(self.ask("report"), self.stamp, self.formatted | BLANK)
        return self.shown

    def tree(self):
        return self.report().tree

    def tree_lines(self):
        return [line for line in self.report().text.splitlines() if line.startswith("/")]

    def state(self):
        return self.report().state()

    def mounts(self):
        return self.report().mounts

    def mark(self, point):
        return self.report().mark(point)

    def folders(self):
        return self.report().folders

    def semaphore(self):
        return self.report().semaphore

    def settings(self):
        found = {}
        for line in self.ask("settings_report").splitlines():
            what, _, rest = line.partition(" ")
            if what in ("loaded", "damaged"):
                found[rest.split()[0]] = (rest if what == "damaged" else "", found.get(rest.split()[0], ("", []))[1])
            elif what in (SAVED, FLASH) and rest:
                found[what][1].append(rest)
        return found

    def findings(self):
        return self.wrong + [f"crash: {job}" for job in self.jobs
                             if (job.status or 0) < 0 and not job.killed and not self.may_be_ended(job)]

    def may_be_ended(self, job):
        return job.status == -9 and job.command in OPEN_DISKS and any(
            other is not job and other.command in END_USERS and other.t in (None, job.t) and
            other.began <= job.ended <= (other.ended or job.ended) for other in self.jobs)


class Report:
    """The answer of the appliance's "report"."""

    def __init__(self, text, stamp, doubtful):
        self.text, self.stamp, self.doubtful = text, stamp, doubtful
        self.tree, self.mounts, self.marks, self.folders = {}, {}, {}, []
        self.sessions, self.disks, self.semaphore = set(), {}, ""
        for line in text.splitlines():
            kind, *words = line.split(" ")
            if line.startswith("/"):
                path, _, value = line.partition("=")
                self.tree[path] = value
            elif kind == "session":
                self.sessions.add(int(words[0]))
            elif kind == "lun":
                self.disks[int(words[1]), int(words[2])] = words[0]
            elif kind == "mount":
                point, node, t, l, *mark = words
                self.mounts.setdefault(point, []).append(node)
                self.marks[point] = (int(t), int(l), mark)
            elif kind == "folder":
                self.folders.append(words[0])
            elif kind == "semaphore":
                self.semaphore = words[0]

    def state(self):
        return {t: (t in self.sessions, 1, 0, [Disk(self.disks.get((t, l), ""), self.stamp) for l in range(4)])
                for t in TARGETS}

    def mark(self, point):
        """What judge.disk_findings takes: whose disk it is by the kernel's word, and the stamp of its data."""
        t, l, mark = self.marks[point]
        if mark == [str(t), str(l), str(self.stamp)] or ((t, l) in self.doubtful and mark in ([], [""])):
            return t, l, self.stamp
        return (t, l, int(mark[2])) if mark[:2] == [str(t), str(l)] else None


class Round(many.Round):
    def __init__(self, life, seed, runs):
        self.life, self.appliance, self.seed, self.runs = life, life.appliance, seed, runs
        self.downtimes, self.findings, self.fsck = [], [], ""

    def play(self):
        self.world = Machine(self.appliance, self.seed)
        self.prepare()
        if not self.findings:
            self.furnish()
        if not self.findings:
            self.storm()
            self.after()
            self.look_at_disks()
        found = self.findings + self.world.findings()
        if found:
            self.record()
        return found

    def prepare(self):
        """Nothing is stored, and every disk is as it is in every round."""
        self.world.ask("; ".join(f"remvol --del -n iqn.2026-01.org.example:t{t} >/dev/null" for t in TARGETS), may_fail=True)
        self.world.ask("; ".join(f"{'blank' if disk in BLANK else 'fill'} {disk[0]} {disk[1]} {self.seed}" for disk in DISKS))
        if not self.life.filled:  # what is put on the disks is the same each time but for the mark
            self.life.filled = self.disks()
        self.before = {disk: (*was[:3], self.mark_of(disk)) if disk in DISKS and disk not in BLANK else was
                       for disk, was in self.life.filled.items()}
        broken = [disk for disk in DISKS if disk not in BLANK and (self.before[disk][0] or self.before[disk][3] != self.mark_of(disk))]
        if broken:
            self.check(f"torture: the disks {broken} are not as they are to be: {self.before}\n{self.fsck}")

    def mark_of(self, disk):
        return f"{disk[0]} {disk[1]} {self.seed}"

    def furnish(self):
        for t, l in STORED:
            self.world.tool("add", t=t, l=l, share=f"v{t}{l}")
        self.world.together([self.world.job("connect", t=t) for t in CONNECTED])
        bad = [f"{job}: {job.text[-300:]}" for job in self.world.jobs if job.status != 0]
        if bad:
            self.check(f"torture: the beginning failed: {bad}")

    def storm(self):
        start = shlex.join(unit_commands()[0])
        first, lines, killed, numbers = len(self.world.jobs), [], set(), {}
        for at, kind, details in plan(self.seed, self.runs):
            lines.append(f"at {at * 100:.0f}")
            if kind == "run":
                number, command, t, l, share, named = details
                lines.append(self.begin(command, t, l, share, named))
                numbers[number] = len(self.world.jobs)
            elif kind == "end":
                killed.add(numbers[details[0]])
                lines.append(f"end {numbers[details[0]]} {'group' if details[1] else ''}")
            else:
                lines.append(f"restart {details} {start}")
        self.world.play(lines, PATIENCE)
        self.downtimes = self.world.downtimes
        for job in self.world.jobs[first:]:
            job.killed = job.number in killed and job.status == -9
            if job.status is None:
                self.check(f"hang: {job}")
                job.began = job.began or 0
                job.ended = float("inf")
            elif job.command == "format":
                self.world.formatted.add((job.t, job.l))
        offered = self.offered_shares()
        for share, t, l in self.world.seen:
            if share not in offered.get((t, l), ()):
                self.check(f"foreign-disk: LUN {l} of t{t} was seen as '{share}', which nobody asked for")

    def begin(self, command, t, l, share, named):
        options = {name: {"t": t, "l": l, "share": share}[name] for name in many.TAKES.get(command, ())}
        if command == "recover":
            command, options = "oiscsi_evt_recover", {"t": t}
        if command == "disconnect" and named:
            options = {"t": t}
        job = self.world.job(command, **options)
        return f"begin {job.number} {self.world.line(job)}"

    def all_well(self):
        """Every target that is stored can be connected, shows its data, and can be left again."""
        world = self.world
        stored = sorted({t for t, _ in judge.volumes(world.tree())})
        world.tool("disconnect")
        jobs = [world.job("connect", t=t) for t in stored]
        world.together(jobs)
        for job in jobs:
            if job.status != 0:
                self.check(f"unwell: {job}: {job.text[-800:]}")
        world.tool("status")
        for n, (keys, luns) in judge.slots(world.tree()).items():
            said = [keys.get("status"), *(lun.get("status") for lun in luns.values())]
            if luns and said != ["Connected"] + ["Running"] * len(luns):
                self.check(f"unwell: slot {n} says {said} after every target was connected")
        self.findings += [f"{text} (at the end)" for text in judge.disk_findings(world)]
        self.well = set(judge.volumes(world.tree()))
        job = world.tool("disconnect")
        if job.status != 0 and stored:
            self.check(f"unwell: {job}: {job.text[-800:]}")
        if world.mounts():
            self.check(f"unwell: mounted after every target was disconnected: {world.mounts()}")

    # --- the disks ---

    def disks(self):
        """{disk: (status of e2fsck, digest of its first mebibyte, of its text, its mark)}, and the witnesses."""
        found, self.fsck = {}, ""
        for line in self.world.ask("look_at_luns").splitlines():
            kind, *words = line.split()
            if kind == "disk":
                found[int(words[0]), int(words[1])] = (int(words[2]), *words[3:5], " ".join(words[5:]))
            elif kind == "witness":
                found[int(words[0]), 3] = words[1]
            elif kind == "fsck":
                self.fsck += line + "\n"
        return found

    def look_at_disks(self):
        """Nobody is logged in: what is on each disk."""
        found = self.disks()
        for disk, before in self.before.items():
            name = f"LUN {disk[1]} of t{disk[0]}"
            asked = disk in self.world.formatted or disk in BLANK
            if disk[1] == 3 and found[disk] != before:
                self.check(f"foreign-disk: {name}, which no command names, has changed")
            elif disk[1] != 3 and not asked and found[disk] != before:
                self.check(f"data-lost: {name} was {before} and is {found[disk]}\n{self.fsck}")
            elif disk in self.well and asked and found[disk][0] != 0:
                self.check(f"damaged: e2fsck says {found[disk][0]} of {name}\n{self.fsck}")
            named = any(job.t == disk[0] and job.l in (None, disk[1]) for job in self.world.jobs)
            if disk in BLANK and not named and found[disk] != before:
                self.check(f"foreign-disk: {name}, which no command names, has changed")

    def summary(self):
        """How the runs ended."""
        ends = collections.Counter((job.command, job.status) for job in self.world.jobs)
        return ", ".join(f"{count} {command} = {status}" for (command, status), count in sorted(ends.items(), key=str))

    def record(self):
        zero = self.world.jobs[0].began or 0
        lines = [f"{(job.began or 0) - zero:8.2f} {(job.ended or 0) - zero:8.2f} {job}" for job in self.world.jobs]
        lines += [f"daemon away {gone - zero:.2f} to {back - zero:.2f}" for gone, back in self.downtimes]
        lines += [self.world.ask("report", may_fail=True), self.world.ask("dmesg | tail -n 200", may_fail=True)]
        for job in self.world.jobs:
            lines += [f"--- {job}", job.text]
        self.story = "\n".join(lines)


class Life:
    """One machine, and the rounds that it lives through."""

    def __init__(self, prepared, folder):
        self.appliance, self.filled = Appliance(folder, prepared), None
        began = time.monotonic()
        self.appliance.boot()
        self.appliance.pace = max(1, (time.monotonic() - began) / BOOT_SECONDS)
        status, text = self.appliance.ask("(template)")
        if status != 0:
            raise Dead(f"its first volume was not made: {text[-1000:]}")


def run(options):
    seed = first_seed(options.seed)
    print(f"disks: seed {seed}", flush=True)
    prepared, begin = prepare("disks.sh"), time.monotonic()
    good = bad = number = 0
    while number < options.rounds:
        with tempfile.TemporaryDirectory(dir=lab.CACHE, prefix="disks.") as folder:
            life = Life(prepared, folder)
            with life.appliance:
                for _ in range(min(ROUNDS_A_LIFE, options.rounds - number)):
                    began, this = time.monotonic(), Round(life, seed + number, options.runs)
                    number += 1
                    try:
                        found = this.play()
                    except Dead as dead:
                        found, this.story = [f"dead: {dead}"], ""
                    good, bad = good + (not found), bad + bool(found)
                    if options.verbose or found:
                        print(f"round with seed {this.seed}: {time.monotonic() - began:.0f} s, {len(found)} findings; "
                              f"{this.summary()}", flush=True)
                    for text in found:
                        print(f"  {text}", flush=True)
                    if found and options.stories:
                        place = pathlib.Path(options.stories)
                        place.mkdir(parents=True, exist_ok=True)
                        (place / f"disks-{this.seed}.txt").write_text("\n".join(found) + "\n\n" + this.story)
                    if found:
                        break  # what is wrong now is not the next round's
    print(f"disks: {good} passed, {bad} failed ({number} rounds of {options.runs} runs, {time.monotonic() - begin:.0f} s)")
    return bad == 0


def add_form(forms):
    form = forms.add_parser("disks", help="rounds of many runs at once in the virtual appliance")
    form.add_argument("--rounds", type=int, default=20)
    form.add_argument("--seed", type=int, help="of the first round; the next has the next number")
    form.add_argument("--runs", type=int, default=many.RUNS)
    form.add_argument("--stories", help="folder for the whole story of a round with findings")
    form.add_argument("--verbose", action="store_true", help="tell of every round")
    form.set_defaults(run=run)
