"""A daemon whose memory runs out: the request fails, the daemon lives, the tree is whole."""
import mmap
import os
import struct

import pytest

from harness.ktree_daemon import BUILD, Daemon

pytestmark = pytest.mark.unsanitized

BEFORE = "<config><a>one</a><b><id>x</id><id><c>three</c></id></b></config>"
LOADED = "<config><p>1</p><q><r>a value that no string keeps in itself</r><r/></q></config>"
REQUESTS = {
    "set": ["-s", "/b/id:4/new/x:3", "value"],
    "replace": ["-s", "/a", "a longer value"],
    "get": ["-g", "/a"],
    "del": ["-d", "/b/id:1"],
    "dump": ["-D", "-"],
    "load": ["-l", "other.xml"],
    "list": ["-t"],
}


@pytest.fixture
def scarce():
    daemon = Daemon(start=False)
    counter = daemon.folder / "left"
    counter.write_bytes(bytes(8))
    (daemon.folder / "before.xml").write_text(BEFORE)
    (daemon.folder / "other.xml").write_text(LOADED)
    daemon.start(env={**os.environ, "LD_PRELOAD": str(BUILD / "tests/harness/libscarce.so"), "SCARCE_FILE": str(counter)})
    with open(counter, "r+b") as file, mmap.mmap(file.fileno(), 8) as daemon.left:
        yield daemon
    daemon.close()


def ask(daemon, *words):
    return daemon.run(*words, cwd=daemon.folder)


@pytest.mark.parametrize("request_words", REQUESTS.values(), ids=REQUESTS)
def test_whichever_allocation_fails(scarce, request_words):
    def set_left(n):
        struct.pack_into("=q", scarce.left, 0, n)

    assert ask(scarce, "-l", "before.xml").returncode == 0
    before = ask(scarce, "-t").stdout
    right = ask(scarce, *request_words)
    after = ask(scarce, "-t").stdout
    assert right.returncode == 0
    failures = 0
    for n in range(1, 2000):
        assert ask(scarce, "-l", "before.xml").returncode == 0
        set_left(n)
        done = ask(scarce, *request_words)
        ran_out = struct.unpack_from("=q", scarce.left)[0] == 0
        set_left(0)
        assert scarce.process.poll() is None
        if done.returncode == 0:
            assert done.stdout == right.stdout and ask(scarce, "-t").stdout == after
        else:
            failures += 1
            assert ran_out and ask(scarce, "-t").stdout == before
        if not ran_out:
            break
    assert not ran_out
    assert failures > 0 or request_words[0] in ("-g", "-d", "-D", "-t")


def test_a_daemon_that_cannot_start_says_so(tmp_path):
    daemon = Daemon(start=False)
    counter = daemon.folder / "left"
    environment = {**os.environ, "LD_PRELOAD": str(BUILD / "tests/harness/libscarce.so"), "SCARCE_FILE": str(counter)}
    (daemon.folder / "vv.xml").write_text(BEFORE)
    failures = 0
    for n in range(1, 500):
        counter.write_bytes(struct.pack("=q", n))
        done = daemon_ends_or_answers(daemon, environment)
        if done is not None:
            failures += 1
            assert done == (1, "ktree: out of memory\n"), n
        if struct.unpack("=q", counter.read_bytes())[0] > 0:
            break
    assert failures > 10
    daemon.close()


def daemon_ends_or_answers(daemon, environment):
    """None when it serves with its settings loaded, otherwise its status and what it said."""
    with open(daemon.folder / "said", "w+") as said:
        try:
            daemon.start(arguments=["-l", daemon.folder / "vv.xml"], env=environment, stderr=said)
        except (AssertionError, FileNotFoundError):
            said.seek(0)
            return daemon.process.wait(20), said.read()
        assert daemon.get("/a") == b"one"
        daemon.stop()
        return None
