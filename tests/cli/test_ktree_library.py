"""The client library: what a program that uses it meets when its daemon is slow, gone, new or hostile."""
import array
import fcntl
import os
import signal
import socket
import struct
import subprocess
import tempfile
import threading
import time

import pytest

from harness.ktree_daemon import BUILD, DEL, GET, KTREEC, MIRROR, Daemon, until


class Caller:
    """A program that makes one call of the library a line."""

    def __init__(self, target):
        self.process = subprocess.Popen([BUILD / "tests/harness/ktree_call", target], stdin=subprocess.PIPE,
                                        stdout=subprocess.PIPE, text=True)
        assert self.process.stdout.readline() == "ready\n"

    def send(self, line):
        self.process.stdin.write(line + "\n")
        self.process.stdin.flush()

    def answer(self):
        return self.process.stdout.readline()[:-1]

    def __call__(self, line):
        self.send(line)
        return self.answer()

    def close(self):
        self.process.stdin.close()
        assert self.process.wait(20) == 0
        self.process.stdout.close()


@pytest.fixture
def daemon():
    daemon = Daemon()
    yield daemon
    daemon.close()


@pytest.fixture
def caller(daemon):
    caller = Caller(daemon.socket)
    yield caller
    caller.close()


class Listener:
    """A socket where something else than a daemon listens: serve(connection, number) is called for every connection."""

    def __init__(self, serve=None, backlog=16):
        self.folder = tempfile.TemporaryDirectory(prefix="ktree.")
        self.path = self.folder.name + "/sock"
        self.socket = socket.socket(socket.AF_UNIX)
        self.socket.bind(self.path)
        self.socket.listen(backlog)
        self.accepted = []
        self.serve = serve
        if serve is not None:
            threading.Thread(target=self.run, daemon=True).start()

    def run(self):
        while True:
            try:
                connection, _ = self.socket.accept()
            except OSError:
                return
            self.accepted.append(connection)
            self.serve(connection, len(self.accepted))

    def close(self):
        self.socket.close()
        for connection in self.accepted:
            connection.close()
        self.folder.cleanup()


def read_request(connection):
    data = b""
    while len(data) < 4 or len(data) < 4 + struct.unpack_from("=I", data)[0]:
        try:
            part = connection.recv(1 << 17)
        except ConnectionResetError:
            return None
        if not part:
            return None
        data += part
    return data


def reply(status, body=b""):
    return struct.pack("=IB3x", 4 + len(body), status) + body


@pytest.fixture
def listen():
    made = []

    def make(*args, **options):
        made.append((Listener(*args, **options)))
        return made[-1]

    yield make
    for listener in made:
        listener.close()


# Calls and their results


def test_calls_and_results(daemon, caller):
    assert caller("get /a 100") == "-1 "
    assert caller("set /a hello world") == "0"
    assert caller("get /a 100") == "11 hello world"
    assert caller("get /a 6") == "5 hello"
    assert caller("get /a 1") == "0 "
    assert caller("get /a 0") == "-1 "
    assert caller("set /a ") == "0"
    assert caller("get /a 100") == "0 "
    assert caller("set /d/x 1") == "0"
    assert caller("get /d 100") == "-1 "
    assert caller("del /d") == "0"
    assert caller("del /d") == "-1"
    for path in ["a", "/", "/a:0", "/a:4097", "/" + "x" * 1023, "/" + "x" * 5000]:
        assert caller(f"set {path} x") == "-1"
        assert caller(f"get {path} 100") == "-1 "
        assert caller(f"del {path}") == "-1"
    assert daemon.listing() == ["/a="]


def test_the_longest_value_and_one_more(daemon, caller):
    longest = "x" * 65535
    assert caller(f"set /a {longest}") == "0"
    assert caller(f"set /a {longest}x") == "-1"
    assert caller("get /a 65536") == f"65535 {longest}"
    assert caller("get /a 70000") == f"65535 {longest}"
    assert caller("get /a 65535") == f"65534 {longest[1:]}"


def test_dump_and_load(daemon, caller):
    file = daemon.folder / "vv.xml"
    caller("set /a x")
    assert caller(f"dump {file}") == "0"
    caller("set /a y")
    assert caller(f"load {file}") == "0"
    assert caller("get /a 10") == "1 x"
    file.write_text("<config><a>cut")
    assert caller(f"load {file}") == "-1"
    assert caller(f"load {file}.missing") == "-1"
    assert caller(f"dump {daemon.folder}/missing/vv.xml") == "-1"
    assert caller("get /a 10") == "1 x"


def test_a_missing_daemon_is_an_error_at_once():
    caller = Caller("/tmp/ktree.nobody/sock")
    start = time.monotonic()
    assert caller("set /a x") == "-1"
    assert caller("get /a 10") == "-1 "
    assert caller("del /a") == "-1"
    assert time.monotonic() - start < 5
    caller.close()


@pytest.mark.unsanitized  # a sanitizer brings its own
@pytest.mark.native
def test_the_library_needs_nothing_but_the_c_library():
    library = BUILD / "lib/libktreec.so"
    needed = subprocess.run(["readelf", "-d", library], capture_output=True, text=True, check=True).stdout
    assert [line.split("[")[1] for line in needed.splitlines() if "NEEDED" in line] == ["libc.so.6]"]


@pytest.mark.unsanitized  # as here
def test_the_library_exports_its_five_functions_and_nothing_else():
    names = subprocess.run(["nm", "-D", "--defined-only", BUILD / "lib/libktreec.so"], capture_output=True, text=True,
                           check=True).stdout
    exported = sorted(line.split()[-1] for line in names.splitlines())
    assert exported == ["ktreec_del", "ktreec_dump", "ktreec_get_wb", "ktreec_load", "ktreec_set"]


# One connection


def test_one_connection_serves_a_process(listen):
    def serve(connection, _):
        while read_request(connection):
            connection.sendall(reply(0))

    listener = listen(serve)
    caller = Caller(listener.path)
    for i in range(20):
        assert caller(f"set /a {i}") == "0"
    assert len(listener.accepted) == 1
    caller.close()


def test_a_child_has_a_connection_of_its_own(daemon, caller):
    caller("set /a x")
    for _ in range(20):
        caller.send("fork /a")
        assert [caller.answer(), caller.answer()] == ["1 x", "1 x"]
    assert caller("get /a 10") == "1 x"


def test_nor_does_a_child_speak_for_its_parent_that_was_made_without_a_word_to_the_library(listen):
    serve, _ = answers_gets(refused)
    listener = listen(lambda *connection: threading.Thread(target=serve, args=connection, daemon=True).start())
    caller = Caller(listener.path)
    assert caller("get /a 10") == "5 value"
    caller.send("clone /a")
    assert [caller.answer(), caller.answer()] == ["5 value", "5 value"]
    assert len(listener.accepted) == 2
    caller.close()


def test_no_descriptor_goes_to_a_child_program(daemon, caller):
    caller("set /a x")
    caller(f"dump {daemon.folder}/vv.xml")
    assert "socket" not in caller("sh ls -l /proc/self/fd | grep -v pipe")
    assert "socket" in caller("sh ls -l /proc/$PPID/fd")


def test_threads_share_it(daemon, caller):
    assert caller("threads /t 200") == "1600"


# Values that are read without asking


def read_often(caller, path="/warm"):
    """From now on the caller reads what the daemon shows in its mirror."""
    caller(f"set {path} x")
    for _ in range(8):
        assert caller(f"get {path} 10") == "1 x"


def test_a_program_that_reads_often_needs_no_answer(daemon, caller):
    caller("set /id:2/share Photos")
    read_often(caller)
    daemon.process.send_signal(signal.SIGSTOP)
    start = time.monotonic()
    assert caller("get /id:2/share 100") == "6 Photos"
    assert caller("get /id:2/share 4") == "3 Pho"
    assert caller("set /id:2/share Photos") == "0"  # changes nothing
    assert time.monotonic() - start < 4
    daemon.process.send_signal(signal.SIGCONT)
    assert caller("set /id:2/share Music") == "0"
    assert caller("get /id:2/share 100") == "5 Music"


def test_what_another_has_written_is_read_at_once(daemon, caller):
    other = Caller(daemon.socket)
    read_often(caller)
    read_often(other)
    for i in range(300):
        value = f"{i}" * (i % 50 + 1)  # also too long for its place, and too long for the mirror
        assert other(f"set /a {value}") == "0"
        assert caller("get /a 1000") == f"{len(value)} {value}"
        assert other("get /a 1000") == f"{len(value)} {value}"
    other.close()


def test_a_deletion_and_a_load_are_seen_at_once(daemon, caller):
    read_often(caller)
    for i in (1, 2, 3):
        caller(f"set /id:{i}/share {i}")
    caller(f"dump {daemon.folder}/vv.xml")
    daemon.run("-d", "/id:2")
    assert [caller(f"get /id:{i}/share 10") for i in (1, 2, 3)] == ["1 1", "1 3", "-1 "]
    daemon.run("-l", daemon.folder / "vv.xml")
    assert [caller(f"get /id:{i}/share 10") for i in (1, 2, 3)] == ["1 1", "1 2", "1 3"]


def test_every_spelling_of_a_path_is_read(daemon, caller):
    read_often(caller)
    caller("set /id/b:1/c x")
    for path in ("/id/b/c", "/id:1/b/c", "/id:1/b:1/c:1"):
        assert caller(f"get {path} 10") == "1 x"
    assert caller("get /id:01/b/c 10") == "-1 "


@pytest.mark.parametrize("number", [signal.SIGTERM, signal.SIGKILL])
def test_the_values_of_a_daemon_that_is_gone_are_gone(daemon, caller, number):
    for value in ("first", "second"):
        caller(f"set /a {value}")
        read_often(caller)
        assert caller("get /a 10") == f"{len(value)} {value}"
        daemon.stop(number)
        assert caller("get /a 10") == "-1 "
        daemon.start()
        assert caller("get /a 10") == "-1 "


def test_a_child_reads_as_its_parent_did(daemon, caller):
    read_often(caller)
    caller("set /a x")
    for i in range(20):
        caller(f"set /a {i}")
        caller.send("fork /a")
        assert caller.answer() == caller.answer() == f"{len(str(i))} {i}"


def test_threads_read_together(daemon, caller):
    read_often(caller)
    assert caller("threads /t 500") == "4000"


def test_a_read_that_asks_for_the_mirror_waits_no_longer_than_another(daemon, caller):
    caller("set /a x")
    assert caller("get /a 10") == "1 x"
    daemon.process.send_signal(signal.SIGSTOP)
    start = time.monotonic()
    assert caller("get /a 10") == "-1 "
    assert 4 < time.monotonic() - start < 8
    daemon.process.send_signal(signal.SIGCONT)
    for _ in range(3):
        assert caller("get /a 10") == "1 x"
    daemon.process.send_signal(signal.SIGSTOP)
    assert caller("get /a 10") == "1 x"  # it was asked for again
    daemon.process.send_signal(signal.SIGCONT)


def test_a_daemon_that_may_write_no_large_file_has_no_mirror():
    daemon = Daemon(prefix=["prlimit", "--fsize=1000000"])
    caller = Caller(daemon.socket)
    read_often(caller)
    assert caller("get /warm 10") == "1 x"
    assert daemon.process.poll() is None
    caller.close()
    daemon.close()


def test_the_next_daemon_is_asked_for_its_mirror_again():
    daemon = Daemon(prefix=["prlimit", "--fsize=1000000"])
    caller = Caller(daemon.socket)
    read_often(caller)
    daemon.stop()
    daemon.start()
    caller("set /warm y")
    for mapped in ("0", "1"):  # from its second read on
        assert caller("get /warm 10") == "1 y"
        assert caller("sh grep -c ktree-mirror /proc/$PPID/maps").strip() == mapped
    caller.close()
    daemon.close()


def answers_gets(with_mirror):
    """Serves a daemon whose every value is "value"; with_mirror(connection) answers the request for the mirror."""
    requests = []

    def serve(connection, _):
        while request := read_request(connection):
            requests.append(request[4])
            if request[4] == MIRROR:
                if not with_mirror(connection):
                    connection.shutdown(socket.SHUT_RDWR)
                    return
            else:
                connection.sendall(reply(0, b"value"))

    return serve, requests


def passing(make):
    def answer(connection):
        descriptor = make()
        connection.sendmsg([reply(0)], [(socket.SOL_SOCKET, socket.SCM_RIGHTS, array.array("i", [descriptor]))])
        os.close(descriptor)
        return True
    return answer


def refused(connection):
    connection.sendall(reply(4))
    return True


def promised(connection):
    connection.sendall(reply(0))
    return True


def memory(size, *seals):
    def make():
        descriptor = os.memfd_create("mirror", os.MFD_ALLOW_SEALING)
        os.ftruncate(descriptor, size)
        for seal in seals:
            fcntl.fcntl(descriptor, fcntl.F_ADD_SEALS, seal)
        return descriptor
    return make


OTHER_MIRRORS = {
    "an older daemon's": lambda _: False,
    "none": refused,
    "a promise": promised,
    "a file": passing(lambda: os.open("/etc/passwd", os.O_RDONLY)),
    "a socket": passing(lambda: socket.socket(socket.AF_UNIX).detach()),
    "memory that may shrink": passing(memory(64 << 20)),
    "memory that is too small": passing(memory(1 << 20, fcntl.F_SEAL_SHRINK)),
    "memory of nothing": passing(memory(64 << 20, fcntl.F_SEAL_SHRINK)),
}


@pytest.mark.parametrize("answer", OTHER_MIRRORS.values(), ids=OTHER_MIRRORS)
def test_without_a_mirror_values_are_asked_for(listen, answer):
    serve, requests = answers_gets(answer)
    caller = Caller(listen(serve).path)
    for _ in range(40):
        assert caller("get /a 100") == "5 value"
    assert requests.count(GET) == 40
    assert 1 <= requests.count(MIRROR) <= 3  # an older daemon ends the connection, and may have been interrupted
    assert "memfd" not in caller("sh ls -l /proc/$PPID/fd")
    caller.close()


# A daemon that was restarted


@pytest.mark.parametrize("number", [signal.SIGTERM, signal.SIGKILL])
def test_a_restart_is_survived(daemon, caller, number):
    for i in range(3):
        assert caller(f"set /a {i}") == "0"
        daemon.stop(number)
        assert caller("set /a x") == "-1"
        assert caller("get /a 10") == "-1 "
        daemon.start()
        assert caller("get /a 10") == "-1 "
        assert caller(f"set /b {i}") == "0"
        daemon.stop(number)
        daemon.start()
        assert caller("set /a again") == "0"
        assert caller("get /a 10") == "5 again"
        daemon.stop(number)
        daemon.start()
        assert caller("del /a") == "-1"
        assert caller(f"dump {daemon.folder}/vv.xml") == "0"


def closes_the_first(answer_later):
    """Reads a request and closes, the first time; answers from then on."""
    requests = []

    def serve(connection, number):
        while request := read_request(connection):
            requests.append(request)
            if number == 1:
                connection.close()
                return
            connection.sendall(answer_later)

    return serve, requests


def test_a_lost_get_is_sent_again(listen):
    serve, requests = closes_the_first(reply(0, b"value"))
    caller = Caller(listen(serve).path)
    assert caller("get /a 100") == "5 value"
    assert [request[4] for request in requests] == [GET, GET]
    caller.close()


def test_a_delete_that_may_have_been_done_is_not_sent_again(listen):
    serve, requests = closes_the_first(reply(0))
    caller = Caller(listen(serve).path)
    assert caller("del /id:2") == "-1"
    assert [request[4] for request in requests] == [DEL]
    assert caller("del /id:2") == "0"
    caller.close()


def test_a_delete_that_was_never_read_is_sent_again(listen):
    requests = []

    def serve(connection, number):
        if number == 1:
            # There is something to read, and it is closed unread.
            connection.recv(1, socket.MSG_PEEK)
            connection.close()
            return
        while request := read_request(connection):
            requests.append(request)
            connection.sendall(reply(0))

    caller = Caller(listen(serve).path)
    assert caller("del /id:2") == "0"
    assert len(requests) == 1
    caller.close()


NONSENSE = {
    "too long for any reply": b"\xff\xff\xff\xff\0\0\0\0",
    "too short for a reply": b"\0\0\0\0\0\0\0\0",
    "more than was asked for": reply(0, b"x" * 101),
    "much more than was asked for": reply(0, b"x" * 50000),
    "more than it says": reply(0, b"x") + b"more",
    "no such status": reply(77),
}


@pytest.mark.parametrize("answer", NONSENSE.values(), ids=NONSENSE)
def test_nonsense_from_the_other_side_is_an_error(listen, answer):
    def serve(connection, _):
        while read_request(connection):
            connection.sendall(answer)

    caller = Caller(listen(serve).path)
    assert caller("get /a 101") == "-1 "
    assert caller("get /a 101") == "-1 "
    caller.close()


# A daemon that does not answer


def test_a_daemon_that_does_not_answer_is_given_up_after_5_seconds(listen, daemon):
    def trickle(connection, _):
        read_request(connection)
        for byte in reply(0, b"x" * 50):
            try:
                connection.sendall(bytes([byte]))
            except OSError:
                return
            time.sleep(1)

    def read_nothing(connection, _):
        connection.setsockopt(socket.SOL_SOCKET, socket.SO_RCVBUF, 1)

    full = listen(backlog=0)
    waiting = []
    while len(waiting) < 100:
        client = socket.socket(socket.AF_UNIX)
        client.setblocking(False)
        waiting.append(client)
        if client.connect_ex(full.path) != 0:
            break
    daemon.process.send_signal(signal.SIGSTOP)
    callers = [Caller(listen().path), Caller(full.path), Caller(listen(trickle).path), Caller(daemon.socket),
               Caller(listen(read_nothing).path), Caller(daemon.socket), Caller(daemon.socket)]
    lines = ["get /a 100", "get /a 100", "get /a 100", "get /a 100", "set /a " + "x" * 65000, "del /a",
             f"dump {daemon.folder}/vv.xml"]
    start = time.monotonic()
    for caller, line in zip(callers, lines):
        caller.send(line)
    for caller, line in zip(callers, lines):
        assert caller.answer() in ("-1", "-1 "), line
        assert 4.5 < time.monotonic() - start < 15, line
    assert not (daemon.folder / "vv.xml").exists()
    daemon.process.send_signal(signal.SIGCONT)
    # What comes late belongs to nobody: the next answer is the answer to the next question.
    assert callers[3]("set /b x") == "0"
    assert callers[3]("get /b 10") == "1 x"
    for caller in callers:
        caller.close()
    for client in waiting:
        client.close()


def test_the_tool_says_that_the_daemon_does_not_answer(listen):
    start = time.monotonic()
    path = listen().path
    done = subprocess.run([KTREEC, "-S", path, "-g", "/a"], capture_output=True, text=True, timeout=60)
    assert (done.returncode, done.stdout, done.stderr) == (3, "", f"ktreec: {path}: the daemon cannot be reached\n")
    assert 4.5 < time.monotonic() - start < 15


def test_a_connection_that_the_daemon_dropped_is_made_anew(daemon):
    small = Daemon(prefix=["prlimit", "--nofile=24:24"])
    callers = []
    try:
        callers = [Caller(small.socket) for _ in range(10)]
        for i in range(3):
            for number, caller in enumerate(callers):
                assert caller(f"set /c{number} {i}") == "0"
                assert caller(f"get /c{number} 10") == f"1 {i}"
                assert caller(f"del /c{number}") == "0"
    finally:
        for caller in callers:
            caller.close()
        small.close()
