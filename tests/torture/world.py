"""A box for tortures: the made-up initiator and disks keep their state (world.h), the tree's daemon runs as its unit
runs it, and every run of the tool says whose it is, so that what it does can be judged.

    world = World(seed)
    world.offer({1: [0, 1], 2: [0]})          what LUNs each target shows when somebody logs in
    world.tool("add", t=1, l=0, share="a")    runs the tool and waits; world.begin(...) does not wait
    world.findings()                          what was wrong so far
"""

import hashlib
import os
import pathlib
import re
import shlex
import shutil
import struct
import sys
import time

REPOSITORY = pathlib.Path(__file__).resolve().parents[2]
sys.path.insert(0, str(REPOSITORY / "tests/cli"))

from harness.world import COMMANDS, SYSTEM_PATH, Box  # noqa: E402

NAME = "iqn.2026-01.org.example:t{}"
INITIATOR = "/iscsi/initiator"
SOCKET = "/var/run/ktree_sock_vv"
SAVED = "/etc/NAS_CFG/vv.xml"
FLASH = "/usr/local/config/vv.xml"
TARGETS, LUNS = 8, 8
MORE_COMMANDS = "rm mkdir chmod grep cp kill udevadm world".split()
CONTENT = {0: "nothing", 1: "ext4", 2: "torn"}
UNREACHABLE = 3  # status of ktreec
LONG = 60  # seconds: no run takes so long, whatever runs beside it

# struct world
HEAD = struct.Struct("4i")
TARGET = struct.Struct("4i")
LUN = struct.Struct("6i")
FAULTS = struct.Struct("12i")
TARGET_SIZE = TARGET.size + LUNS * LUN.size
FAULTS_AT = HEAD.size + (TARGETS + 1) * TARGET_SIZE
SIZE = FAULTS_AT + FAULTS.size


def after_boot(state):
    """The state when the machine has been started anew: node records and disks' contents stay, no session is there."""
    state = bytearray(state)
    for t in range(1, TARGETS + 1):
        at = HEAD.size + t * TARGET_SIZE
        struct.pack_into("i", state, at, 0)
        struct.pack_into("i", state, at + 8, 0)
        for l in range(LUNS):
            struct.pack_into("i", state, at + TARGET.size + l * LUN.size + 4, 0)
    return bytes(state)


class Lun:
    def __init__(self, fields):
        self.offered, self.letter, self.parts, self.content, self.stamp, self.opener = fields

    @property
    def dev(self):
        return f"sd{chr(self.letter)}" if self.letter else ""


class Job:
    """One run of the tool: what it was asked, when it ran, how it ended."""

    def __init__(self, number, command, t, l, share, words):
        self.number, self.command, self.t, self.l, self.share, self.words = number, command, t, l, share, words
        self.began = self.ended = None
        self.running = None
        self.killed = False

    @property
    def status(self):
        return self.running.result.status if self.running and self.running.result else None

    @property
    def output(self):
        return self.running.stdout + self.running.stderr

    def __str__(self):
        text = f"run {self.number}: {shlex.join(self.words)}"
        return text + (" (killed)" if self.killed else "") + (f" = {self.status}" if self.status is not None else "")


def arguments(command, t=None, l=None, share=None, **more):
    words = [f"--{command}"]
    if t is not None:
        words += ["-n", NAME.format(t)]
    if command == "add":
        words += ["-i", f"10.9.0.{t}", "-p", "3260"]
    if command in ("add", "modify", "search_lun"):
        words += ["-c", "1", "-U", f"user{t}", "-P", f"secret{t}secret{t}"]
    if l is not None:
        words += ["-l", str(l)]
    if share is not None:
        words += ["-s", share]
    for name, value in more.items():
        words += [f"-{name}", str(value)]
    return words


class World:
    def __init__(self, *, pace=100, daemon=True):
        self.box = Box()
        self.jobs = []
        self.daemon = None
        self.wrong = []
        self._prepare(pace)
        if daemon:
            self.start_daemon()

    def _prepare(self, pace):
        box = self.box
        tools = box.tools
        shutil.copy(tools / "torture_commands", box.root / "fake/command")
        for name in [*COMMANDS, *MORE_COMMANDS]:
            link = box.root / "fake/bin" / name
            if name == "flashrun":
                link.unlink()  # the real one
            elif not link.is_symlink():
                link.symlink_to("/fake/command")
        self.state_file = box.write("/fake/world/state", HEAD.pack(0, 0, pace, 0) + bytes(SIZE - HEAD.size))
        for folder in ("/etc/NAS_CFG", "/usr/local/config", "/var/lock"):
            box.path(folder).mkdir(parents=True, exist_ok=True)
        box.environment["LD_PRELOAD"] = str(tools / "libtorture_shim.so")
        self.real("world", "begin")

    def real(self, *words, timeout=20, **environment):
        """Runs a program without the shim; gives what it prints."""
        done = self.box.run(words, env={"LD_PRELOAD": None, **environment}, timeout=timeout)
        if done.status != 0:
            raise RuntimeError(f"{shlex.join(words)}: {done}")
        return done.stdout

    def sh(self, text, timeout=20):
        """Runs a shell text with the real commands."""
        return self.real("/bin/sh", "-c", text, timeout=timeout, PATH=f"{self.box.build}/bin:{SYSTEM_PATH}")

    # --- the tree's daemon, as its unit runs it ---

    def start_daemon(self):
        """Starts it and does what the unit does before others may ask."""
        start, post = unit_commands()
        box = self.box
        self.daemon = box.start(start, env={"LD_PRELOAD": None})
        for words in post:
            done = box.run(words, env={"LD_PRELOAD": None})
            if done.status != 0:
                self.wrong.append(f"daemon: {words} after its start = {done.status}: {done.stderr}")
        if not post:
            box.wait_until(self.answers, what="the tree's daemon")

    def kill_daemon(self, number=9):
        self.daemon.kill(number)
        self.daemon.wait()

    def answers(self):
        return self.ktreec("-t").status != UNREACHABLE

    def ktreec(self, *words):
        return self.box.run(["ktreec", "-S", SOCKET, *words], env={"LD_PRELOAD": None})

    def tree(self):
        return self.box.tree.dump()

    # --- the state of the made-up world ---

    def state(self):
        data = self.state_file.read_bytes()
        targets = {}
        for t in range(1, TARGETS + 1):
            at = HEAD.size + t * TARGET_SIZE
            online, record, session, _ = TARGET.unpack_from(data, at)
            luns = [Lun(LUN.unpack_from(data, at + TARGET.size + l * LUN.size)) for l in range(LUNS)]
            targets[t] = (online, record, session, luns)
        return targets

    def _poke(self, at, *numbers):
        with open(self.state_file, "r+b", buffering=0) as file:
            file.seek(at)
            file.write(struct.pack(f"{len(numbers)}i", *numbers))

    def offer(self, luns, content=0):
        for t, numbers in luns.items():
            for l in numbers:
                self._poke(HEAD.size + t * TARGET_SIZE + TARGET.size + l * LUN.size, 1, 0, int(content > 0), content, 0, 0)

    def plan(self, active=1, kind_of=0, index=0, forever=0, kind=0, error=5, traced=0):
        self._poke(FAULTS_AT, active, kind_of, index, forever, kind, error, traced, 0, 0, 0, 0, 0)

    def faults(self):
        fields = FAULTS.unpack_from(self.state_file.read_bytes(), FAULTS_AT)
        return fields[7], fields[8:]

    # --- a beginning that is used again and again ---

    def snapshot(self):
        """The tree, the state and the mounts, to begin with in another world."""
        mounts = [word for point, sources in self.mounts().items() for word in (sources[-1], point)]
        flash = self.box.path(FLASH)
        return (self.dump(), flash.read_bytes() if flash.exists() else None,
                self.state_file.read_bytes(), mounts)

    def restore(self, snapshot):
        """Before the daemon is started."""
        saved, flash, state, mounts = snapshot
        if saved is not None:
            self.box.write(SAVED, saved, 0o600)
        if flash is not None:
            self.box.write(FLASH, flash, 0o600)
        self.state_file.write_bytes(state)
        self.real("world", "restore", *mounts)
        (self.box.root / "fake/world/log").unlink(missing_ok=True)

    def degrade(self, share):
        """The file system of a mounted volume turns read-only."""
        self.real("world", "degrade", f"/mnt/VV/{share}")

    def dump(self):
        """The whole tree, as its daemon writes it; nothing when it does not run."""
        done = self.ktreec("-D", "/fake/now.xml")
        if done.status == UNREACHABLE:
            return b""
        if done.status != 0:
            raise RuntimeError(f"the tree is not dumped: {done}")
        return (self.box.root / "fake/now.xml").read_bytes()

    def lasting(self):
        """A digest of all that a later run may meet: equal ones end equally. Only while nothing runs but the tree's daemon."""
        state = bytearray(self.state_file.read_bytes()[:FAULTS_AT])
        for t in range(1, TARGETS + 1):
            for l in range(LUNS):  # a writer that was killed stays noted, its number does not matter
                opener = HEAD.size + t * TARGET_SIZE + TARGET.size + (l + 1) * LUN.size - 4
                state[opener : opener + 4] = struct.pack("i", any(state[opener : opener + 4]))
        processes = sorted(map(shlex.join, self.box.processes().values()))
        parts = (bytes(state), self.dump(), self.real("world", "lasting").encode("utf-8", "surrogateescape"), repr(processes).encode())
        return hashlib.sha256(b"".join(hashlib.sha256(part).digest() for part in parts)).hexdigest()

    # --- runs of the tool ---

    def begin(self, command, t=None, l=None, share=None, under=(), **more):
        """`under`: words that go before the tool's own, of a program that runs it."""
        job = Job(len(self.jobs) + 1, command, t, l, share, arguments(command, t, l, share, **more))
        self.jobs.append(job)
        short = {"oiscsi_evt_recover": "recover", "oiscsi_evt_reopen": "reopen"}.get(command, command)
        mark = f"{job.number}:{short}:{'-' if t is None else t}:{'-' if l is None else l}"
        job.began = time.monotonic()
        job.running = self.box.start([*under, "remvol", *job.words], env={"TORTURE_RUN": mark})
        return job

    def tool(self, command, *, timeout=LONG, **options):
        job = self.begin(command, **options)
        job.running.wait(timeout)
        job.ended = time.monotonic()
        return job

    def kill(self, job, whole_group):
        job.killed = True
        if job.running.result is None:
            if whole_group:
                job.running.kill()
            else:
                self.box.run(["/bin/kill", "-9", str(job.running.pid)], env={"LD_PRELOAD": None})

    def pump(self, seconds):
        """Takes what the box reports for so long; jobs that end get their time."""
        end = time.monotonic() + seconds
        while True:
            self.box.pump(min(0.01, max(end - time.monotonic(), 0.001)))
            now = time.monotonic()
            for job in self.jobs:
                if job.ended is None and job.running.result is not None:
                    job.ended = now
            if now >= end:
                return

    def settle(self, timeout=LONG):
        """Waits for every run; one that does not end is a finding."""
        end = time.monotonic() + timeout
        while any(job.ended is None for job in self.jobs) and time.monotonic() < end:
            self.pump(0.01)
        for job in self.jobs:
            if job.ended is None:
                waits = self.sh(f"cat /proc/{job.running.pid}/stack /proc/{job.running.pid}/wchan 2>&1; ps -ef; cat /proc/locks; ipcs -s")
                self.wrong.append(f"hang: {job} does not end in {timeout} s\n{waits}")
                self.kill(job, True)
                job.running.wait()
                job.ended = time.monotonic()
        try:
            self.box.wait_quiet(timeout)
        except TimeoutError as late:
            self.wrong.append(f"hang: {late}")

    # --- judgement ---

    def log(self):
        path = self.box.root / "fake/world/log"
        return [line.split("\t", 3) for line in path.read_text().splitlines()] if path.exists() else []

    def violations(self):
        return [f"{text}  [run {run}]" for kind, _, run, text in self.log() if kind == "V"]

    def mounts(self):
        """Mount point below /mnt/VV to source."""
        text = (self.box.root / "proc/1/mountinfo").read_text()
        lines = [line.split() for line in text.splitlines()]
        found = {}
        for line in lines:
            point = re.sub(r"\\(\d{3})", lambda m: chr(int(m[1], 8)), line[4])
            if point.startswith("/mnt/VV/"):
                found.setdefault(point, []).append(line[line.index("-") + 2])
        return found

    def mark(self, point):
        """(target, LUN, stamp) of the data that is seen there; None when it is gone."""
        try:
            t, l, stamp = map(int, (self.box.path(point) / ".data").read_text().split())
        except (OSError, ValueError):
            return None
        return t, l, stamp

    def folders(self):
        folder = self.box.path("/mnt/VV")
        return [entry.name for entry in folder.iterdir()] if folder.exists() else []

    def tree_lines(self):
        return self.ktreec("-t", INITIATOR).stdout.splitlines()

    def settings(self):
        """{file: (what is wrong with it, the lines of the tree that it makes)} of those that are there."""
        box, found, other = self.box, {}, "/run/other"
        daemon = box.start(["ktree", "-n", "config", "-s", other], env={"LD_PRELOAD": None})
        try:
            # Its socket is there before it can be reached.
            box.wait_until(lambda: box.run(["ktreec", "-S", other, "-t"], env={"LD_PRELOAD": None}).status != UNREACHABLE,
                           what="a tree of its own")
            for file in filter(lambda file: box.path(file).exists(), (SAVED, FLASH)):
                load = box.run(["ktreec", "-S", other, "-l", file], env={"LD_PRELOAD": None})
                lines = box.run(["ktreec", "-S", other, "-t", INITIATOR], env={"LD_PRELOAD": None}).stdout.splitlines()
                found[file] = (load.stderr or f"status {load.status}" if load.status else "", lines)
        finally:
            daemon.kill(9)
            daemon.wait()
        return found

    def semaphore(self):
        """What the format semaphore stands at; "" when there is none."""
        return self.real("world", "semaphore").strip()

    def crashes(self):
        found = [f"crash: {job}" for job in self.jobs if job.status is not None and job.status < 0 and not job.killed]
        return found + [f"sanitizer: {p.read_text()}" for p in (self.box.root / "fake").glob("sanitizer.*")]

    def findings(self):
        return self.wrong + self.crashes() + self.violations()

    def close(self):
        if self.daemon is not None and self.daemon.result is None:
            self.daemon.kill(9)
        self.box.close()

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.close()


def unit_commands():
    """The start of the tree's daemon and what follows it, with the package's paths put into the build's."""
    text = (REPOSITORY / "packaging/units/remvol-tree.service").read_text()
    place = {"/usr/bin/": "", "/usr/sbin/": "", "/usr/lib/remvol/": f"{REPOSITORY}/packaging/helpers/"}

    def words(line):
        found = shlex.split(line.split("=", 1)[1].lstrip("-+!"))
        for old, new in place.items():
            found[0] = found[0].replace(old, new)
        return found

    lines = text.splitlines()
    start = [words(line) for line in lines if line.startswith("ExecStart=")]
    post = [words(line) for line in lines if line.startswith("ExecStartPost=")]
    return start[0], post
