"""A secret is looked for everywhere while it goes through every command that knows it: the arguments and the environment of
every process all the time, then logs, files, what was sent to the journal, and cores."""

import random
import socket
import stat
import threading

import pytest

from pairs import stored
from world import FLASH, INITIATOR, NAME, SAVED, SOCKET, World

SECRET = "secret1secret1"  # of the first target; see world.arguments()
CANARY = SECRET.encode()
COMMANDS = (("add", {"t": 1, "l": 2, "share": "v12"}), ("modify", {"t": 1}), ("connect", {"t": 1}), ("status", {}),
            ("oiscsi_evt_reopen", {"t": 1}), ("oiscsi_evt_recover", {"t": 1}), ("disconnect", {"t": 1}), ("init", {}))
SEARCH = ["remvol", "--search_lun", "-n", NAME.format(1), "-i", "10.9.0.1", "-p", "3260", "-c", "1", "-U", "user1", "-P", SECRET]


def read(path):
    try:
        return path.read_bytes()
    except OSError:
        return b""


class Watcher:
    """Reads /proc of every process of the box again and again. `wrong` is who showed the secret and may not, `right` how often
    iscsiadm, or its shell, did."""

    def __init__(self, box):
        self.proc = box.root / "proc"
        self.right, self.wrong, self.looks, self.clean = 0, set(), 0, set()
        self.ended = threading.Event()
        self.thread = threading.Thread(target=self.run)

    def __enter__(self):
        self.thread.start()
        return self

    def __exit__(self, *_):
        self.ended.set()
        self.thread.join()

    def run(self):
        while not self.ended.is_set():
            self.looks += 1
            for entry in self.proc.iterdir():
                if entry.name.isdigit():
                    self.look(entry)

    def look(self, entry):
        words, variables = read(entry / "cmdline"), read(entry / "environ")
        if CANARY in variables:
            self.wrong.add(f"environment of {words}")
        name = words.split(b"\0")[0]
        if name.endswith(b"remvol") and CANARY not in words:
            self.clean.add(entry.name)
        if CANARY not in words:
            return
        if b"iscsiadm" in words and name.endswith((b"iscsiadm", b"sh")):
            self.right += 1
        elif name != b"remvol" or entry.name in self.clean:  # the tool's own, until it has read them
            self.wrong.add(f"arguments {words}")


class Journal:
    """The sockets that messages for the journal go to; keeps what comes."""

    def __init__(self, box):
        self.sockets = []
        for name in ("/dev/log", "/run/systemd/journal/socket", "/run/systemd/journal/dev-log", "/run/systemd/journal/stdout"):
            path = box.path(name)
            path.parent.mkdir(parents=True, exist_ok=True)
            kind = socket.SOCK_STREAM if name.endswith("stdout") else socket.SOCK_DGRAM
            self.sockets.append(socket.socket(socket.AF_UNIX, kind | socket.SOCK_NONBLOCK))
            self.sockets[-1].bind(str(path))
            if kind == socket.SOCK_STREAM:
                self.sockets[-1].listen()

    def close(self):
        """Gives all that came."""
        found = b""
        for one in self.sockets:
            try:
                while True:
                    found += one.accept()[0].recv(1 << 16) if one.type == socket.SOCK_STREAM else one.recv(1 << 16)
            except BlockingIOError:
                one.close()
        return found


def files_with_secret(box):
    """{path: mode} of all that was made or changed; the fakes' own folder is not looked at."""
    found = {}
    for place in ("/fake/upper", "/run", "/tmp", "/mnt", "/root", "/dev"):
        root = box.root / place[1:]
        for path in root.rglob("*"):
            name = f"{'' if place == '/fake/upper' else place}/{path.relative_to(root)}"
            if path.is_file() and not path.is_symlink() and not name.startswith("/fake/") and CANARY in read(path):
                found[name] = stat.S_IMODE(path.stat().st_mode)
    return found


@pytest.fixture
def world():
    with World(pace=100) as world:
        stored(world, (1, 0), (1, 1))
        world.real("ktreec", "-S", SOCKET, "-s", f"{INITIATOR}/dbg", "3")
        yield world


@pytest.mark.parametrize("refused", [False, True])
def test_the_secret_is_where_it_must_be_and_nowhere_else(world, refused):
    """Refused: iscsiadm fails from then on, and what failed is told."""
    journal = Journal(world.box)
    if refused:
        (world.box.root / "fake/bin/iscsiadm").unlink()
        world.box.write("/fake/bin/iscsiadm", "#!/bin/sh\nsleep 0.02\nexit 6\n", 0o755)
    with Watcher(world.box) as watcher:
        said = "".join(world.tool(command, **options).output for command, options in COMMANDS)
        done = world.box.run(SEARCH)
        world.box.wait_quiet()
    said += done.stdout + done.stderr
    assert watcher.looks > 100 and watcher.right > 0  # it looked, and in time
    assert not watcher.wrong
    assert "'***'" in said and SECRET not in said
    assert CANARY not in journal.close()
    assert files_with_secret(world.box) == {SAVED: 0o600, FLASH: 0o600}


def test_what_looks_for_it_finds_it(world):
    box = world.box
    journal = Journal(box)
    with Watcher(box) as watcher:
        for words, more in ((["sleep", "0.5"], {"VARIABLE": SECRET}), (["sh", "-c", "sleep 0.5; :", SECRET], {})):
            box.run(words, env={"LD_PRELOAD": None, **more})
    with socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM) as sender:
        sender.sendto(CANARY, str(box.path("/dev/log")))
    for name in ("/tmp/core", "/run/remvol/x", "/var/log/remvol", "/mnt/VV/v10"):
        box.write(name, CANARY)
    assert {text.split()[0] for text in watcher.wrong} == {"environment", "arguments"} and CANARY in journal.close()
    assert {"/tmp/core", "/run/remvol/x", "/var/log/remvol", "/mnt/VV/v10", SAVED} <= files_with_secret(box).keys()


def may_leave_core(world):
    """Whether a program that is killed in /tmp leaves a core there at all."""
    world.box.run(["sh", "-c", "ulimit -c unlimited; cd /tmp; sh -c 'kill -ABRT $$'"], env={"LD_PRELOAD": None})
    cores = list(world.box.path("/tmp").glob("core*"))
    for core in cores:
        core.unlink()
    return bool(cores)


def cores_with_secret(world, whose):
    """Takes the cores away: the next one has the same name."""
    cores = list(world.box.path("/tmp").glob("core*"))
    found = [whose for core in cores if CANARY in read(core)]
    for core in cores:
        core.unlink()
    return found


@pytest.mark.parametrize("seed", range(3))
def test_no_core_shows_it(world, seed):
    """The tool is killed at any moment behind the reading of its arguments, and at last the tree's daemon."""
    if not may_leave_core(world):
        pytest.skip("cores go elsewhere on this machine")
    dice, killed, shown = random.Random(seed), 0, []
    for command, options in COMMANDS * 3:
        under = ["sh", "-c", 'ulimit -c unlimited; cd /tmp; exec "$@"', "sh"]
        job = world.begin(command, under=under, **options)
        words = world.box.root / f"proc/{job.running.pid}/cmdline"
        while job.status is None and (not read(words).startswith(b"remvol") or CANARY in read(words)):
            world.pump(0.001)
        world.pump(dice.uniform(0, 0.2))
        world.box.run(["/bin/kill", "-ABRT", str(job.running.pid)], env={"LD_PRELOAD": None})
        job.running.wait()
        killed += job.status == -6
        shown += cores_with_secret(world, str(job))
    world.daemon.kill(6)
    world.daemon.wait()
    assert killed > 3
    assert not shown + cores_with_secret(world, "the tree's daemon")
