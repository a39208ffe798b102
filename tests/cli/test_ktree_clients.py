"""Clients that do everything wrong: they cost the daemon little and its other clients nothing."""
import array
import os
import pathlib
import signal
import socket
import struct
import subprocess
import time

import pytest

from harness.ktree_daemon import DEL, DUMP, GET, KTREE, LIST, LOAD, SET, TRACED, Daemon, ask, frame, get_frame, receive, until

PATIENCE = 2.0  # seconds for an answer, on a machine that is busy with other tests


@pytest.fixture
def daemon():
    daemon = Daemon()
    yield daemon
    daemon.close()


def garbage(daemon):
    client = daemon.connect()
    client.sendall(b"GET / HTTP/1.1\r\nHost: nobody\r\n\r\n")
    return client


def huge_length(daemon):
    client = daemon.connect()
    try:
        client.sendall(struct.pack("=IBBH", 0xFFFFFFFF, SET, 0, 2) + b"/a" + b"x" * 60000)
    except BrokenPipeError:
        pass  # the first piece was enough for the daemon
    return client


def half_a_frame(daemon):
    client = daemon.connect()
    client.sendall(frame(SET, b"/bad", b"x" * 60000)[:30000])
    return client


def half_a_length(daemon):
    client = daemon.connect()
    client.sendall(b"\x10\x00")
    return client


def hang_up(daemon):
    client = daemon.connect()
    client.sendall(frame(SET, b"/bad", b"x" * 60000)[:50])
    client.close()
    return client


def hang_up_before_the_reply(daemon):
    client = daemon.connect()
    client.sendall(get_frame(b"/good"))
    client.close()
    return client


def silent(daemon):
    return daemon.connect()


def not_reading(daemon):
    """Asks for large values and reads nothing of them, until nothing goes out any more."""
    client = daemon.connect()
    client.setsockopt(socket.SOL_SOCKET, socket.SO_RCVBUF, 1)
    client.setblocking(False)
    try:
        for _ in range(20):
            client.sendall(get_frame(b"/large"))
    except OSError:
        pass
    return client


def slow(daemon):
    client = daemon.connect()
    client.sendall(frame(SET, b"/bad", b"x" * 200)[:1])
    return client


def half_closed(daemon):
    client = daemon.connect()
    client.sendall(get_frame(b"/good"))
    client.shutdown(socket.SHUT_WR)
    return client


def too_eager(daemon):
    """In one piece with the end of a request comes the next one."""
    client = daemon.connect()
    client.sendall(get_frame(b"/good")[:10])
    try:
        client.sendall(get_frame(b"/good")[10:] + get_frame(b"/good"))
    except BrokenPipeError:
        pass
    return client


BAD = [garbage, huge_length, half_a_frame, half_a_length, hang_up, hang_up_before_the_reply, silent, not_reading, slow,
       half_closed, too_eager]


def test_200_bad_clients_at_once_cost_a_good_one_nothing(daemon):
    daemon.set("/good", "x")
    daemon.set("/large", "y" * 65535)
    good = daemon.connect()
    bad = [BAD[i % len(BAD)](daemon) for i in range(200)]
    slow_ones = [client for i, client in enumerate(bad) if BAD[i % len(BAD)] is slow]
    whole = frame(SET, b"/bad", b"x" * 200)
    longest = 0.0
    for i in range(150):
        for client in slow_ones:
            client.sendall(whole[i + 1:i + 2])
        start = time.monotonic()
        value = str(i).encode()
        assert ask(good, frame(SET, b"/good", value)) == (0, b"")
        assert ask(good, get_frame(b"/good")) == (0, value)
        longest = max(longest, time.monotonic() - start)
    assert longest < PATIENCE
    start = time.monotonic()
    newcomer = daemon.connect()
    assert ask(newcomer, get_frame(b"/good")) == (0, b"149")
    assert time.monotonic() - start < PATIENCE
    assert daemon.get("/bad") is None
    for client in bad + [good, newcomer]:
        client.close()
    assert daemon.get("/good") == b"149"


def test_bad_clients_keep_nobody_busy(daemon):
    daemon.set("/large", "y" * 65535)
    bad = [BAD[i % len(BAD)](daemon) for i in range(90)]
    daemon.set("/a", "all of the above was seen")
    before = daemon.cpu_ticks()
    time.sleep(1)
    assert daemon.cpu_ticks() - before <= 10  # of the 100 that a busy loop would take
    for client in bad:
        client.close()


@pytest.mark.parametrize("bad", [garbage, huge_length])
def test_what_is_no_request_ends_the_connection_at_once(daemon, bad):
    assert receive(bad(daemon)) is None


@pytest.mark.parametrize("request_bytes", [
    struct.pack("=IBBH", 3, GET, 0, 0),  # shorter than a header
    struct.pack("=IBBH", 0, GET, 0, 0),
    struct.pack("=IBBH", 66563, SET, 0, 2),  # longer than the longest request
    struct.pack("=IBBH", 0xFFFFFFFC, SET, 0, 2),  # wraps round with the length's own four bytes
    struct.pack("=IBBH", 4, 0, 0, 0),  # no operation
    struct.pack("=IBBH", 4, 8, 0, 0),
    struct.pack("=IBBH", 4, GET, 1, 0),  # not zero
    struct.pack("=IBBH", 6, GET, 0, 3) + b"/a",  # the path is longer than the request
    get_frame(b"/a") + get_frame(b"/a"),  # the next request before the reply
])
def test_a_broken_frame_ends_the_connection_and_changes_nothing(daemon, request_bytes):
    daemon.set("/a", "x")
    assert ask(daemon.connect(), request_bytes) is None
    assert daemon.listing() == ["/a=x"]


@pytest.mark.parametrize("first_piece", [1, 8, 20])
def test_the_next_request_right_behind_one_in_pieces_ends_the_connection(daemon, first_piece):
    client = daemon.connect()
    request_bytes = frame(SET, b"/a", b"x" * 20)
    client.sendall(request_bytes[:first_piece])
    assert daemon.get("/b") is None  # so the piece has been taken, and the rest comes by itself
    client.sendall(request_bytes[first_piece:] + get_frame(b"/a"))
    assert receive(client) is None
    assert daemon.listing() == []


def test_the_next_request_right_behind_the_longest_one_ends_the_connection(daemon):
    client = daemon.connect()
    client.setsockopt(socket.SOL_SOCKET, socket.SO_SNDBUF, 1 << 20)
    os.kill(daemon.pid(), signal.SIGSTOP)
    client.sendall(frame(SET, b"/" + b"x" * 1022, b"y" * 65535) + get_frame(b"/a"))
    os.kill(daemon.pid(), signal.SIGCONT)
    assert receive(client) is None
    assert daemon.listing() == []


@pytest.mark.parametrize("requests_before", [0, 100])
def test_a_client_that_will_send_no_more_gets_its_reply_and_the_end(daemon, requests_before):
    client = daemon.connect()
    daemon.set("/a", "x")
    for _ in range(requests_before):
        assert ask(client, get_frame(b"/a")) == (0, b"x")
    os.kill(daemon.pid(), signal.SIGSTOP)
    client.sendall(get_frame(b"/a"))
    client.shutdown(socket.SHUT_WR)
    os.kill(daemon.pid(), signal.SIGCONT)
    assert receive(client) == (0, b"x")
    assert client.recv(1) == b""


def test_a_client_that_will_send_no_more_gets_a_long_reply_whole(daemon):
    daemon.set("/large", "y" * 65535)
    client = daemon.connect()
    client.setsockopt(socket.SOL_SOCKET, socket.SO_RCVBUF, 1)
    client.sendall(get_frame(b"/large"))
    client.shutdown(socket.SHUT_WR)
    assert receive(client) == (0, b"y" * 65535)
    assert client.recv(1) == b""


def test_the_longest_request_is_served(daemon):
    client = daemon.connect()
    path = b"/" + b"x" * 1022
    assert ask(client, frame(SET, path, b"y" * 65535)) == (0, b"")
    assert ask(client, get_frame(path)) == (0, b"y" * 65535)
    assert ask(client, frame(SET, b"/a", b"y" * 65536)) == (2, b"")
    assert ask(client, frame(SET, b"/a", b"x\0y")) == (2, b"")
    assert ask(client, frame(GET, b"/a")) == (2, b"")


def test_a_request_may_come_byte_by_byte(daemon):
    client = daemon.connect()
    for request_bytes, reply in [(frame(SET, b"/a", b"value"), (0, b"")), (get_frame(b"/a"), (0, b"value")),
                                 (frame(DEL, b"/a"), (0, b"")), (frame(DEL, b"/a"), (1, b""))]:
        for i in range(len(request_bytes)):
            client.sendall(request_bytes[i:i + 1])
        assert receive(client) == reply


def test_a_client_may_ask_in_a_row_and_with_pauses(daemon):
    client = daemon.connect()
    number = 0
    for in_a_row, pause in [(300, 0.0), (30, 0.002), (300, 0.0), (3, 0.1)]:
        for _ in range(in_a_row):
            number += 1
            assert ask(client, frame(SET, b"/a", str(number).encode())) == (0, b"")
            time.sleep(pause)
    assert ask(client, get_frame(b"/a")) == (0, str(number).encode())
    before = daemon.cpu_ticks()
    time.sleep(1)
    assert daemon.cpu_ticks() - before <= 1


def test_a_reply_is_kept_for_a_slow_reader(daemon):
    daemon.set("/large", "y" * 65535)
    client = daemon.connect()
    client.setsockopt(socket.SOL_SOCKET, socket.SO_RCVBUF, 1)
    for _ in range(5):
        client.sendall(get_frame(b"/large"))
        data = b""
        while len(data) < 65543:
            data += client.recv(100)
        assert data[8:] == b"y" * 65535


@pytest.mark.long
def test_a_half_frame_or_an_unread_reply_is_given_up_after_30_seconds(daemon):
    daemon.set("/large", "y" * 65535)
    patient = daemon.connect()
    half = half_a_frame(daemon)
    trickling = daemon.connect()
    unread = not_reading(daemon)
    start = time.monotonic()
    watched = {half: None, trickling: None}
    request_bytes = frame(SET, b"/bad", b"x" * 60000)
    sent = 0
    while None in watched.values():
        assert time.monotonic() - start < 60
        for client in [client for client, gone in watched.items() if gone is None]:
            client.setblocking(False)
            try:
                if client is trickling:
                    client.send(request_bytes[sent:sent + 1])
                    sent += 1
                gone = client.recv(1) == b""
            except BlockingIOError:
                gone = False
            except (BrokenPipeError, ConnectionResetError):
                gone = True
            if gone:
                watched[client] = time.monotonic() - start
        time.sleep(0.05)
    assert all(28 < gone < 50 for gone in watched.values()), watched
    # What fits into the socket's buffers can still be read; then comes the end.
    unread.settimeout(20)
    try:
        while unread.recv(1 << 17):
            pass
    except ConnectionResetError:
        pass
    assert ask(patient, frame(SET, b"/a", b"still here")) == (0, b"")


def test_when_descriptors_run_out_the_stuck_and_the_idle_make_room():
    daemon = Daemon(prefix=["prlimit", "--nofile=40:40"])
    try:
        daemon.set("/a", "x")
        idle = [daemon.connect() for _ in range(100)]
        start = time.monotonic()
        good = daemon.connect()
        assert ask(good, get_frame(b"/a")) == (0, b"x")
        assert time.monotonic() - start < PATIENCE
        assert receive(idle[0]) is None  # the first one had to go
        assert ask(idle[-1], get_frame(b"/a")) == (0, b"x")  # the last one not
        more = [half_a_frame(daemon) for _ in range(100)]
        fresh = daemon.connect()
        assert ask(fresh, get_frame(b"/a")) == (0, b"x")
        # A connection that was dropped while idle costs its client nothing.
        assert daemon.get("/a") == b"x"
        for client in idle + more + [good, fresh]:
            client.close()
    finally:
        daemon.close()


@pytest.mark.parametrize("bad", [half_closed, too_eager])
def test_clients_that_went_too_far_leave_their_places(bad):
    daemon = Daemon(prefix=["prlimit", "--nofile=40:40"])
    try:
        crowd = [bad(daemon) for _ in range(40)]
        good = daemon.connect()
        assert ask(good, frame(SET, b"/a", b"x")) == (0, b"")
        assert ask(good, get_frame(b"/a")) == (0, b"x")
        until(lambda: open_descriptors(daemon) < 16)
        for client in crowd + [good]:
            client.close()
    finally:
        daemon.close()


def test_without_any_descriptor_it_waits_and_does_not_spin(tmp_path):
    log = tmp_path / "accepts"
    daemon = Daemon(start=False)
    try:
        daemon.process = subprocess.Popen(
            ["strace", "-o", log, "-e", "trace=accept4", "-e", "inject=accept4:error=EMFILE:when=1..4", KTREE, "-n",
             "config", "-s", daemon.socket], stdin=subprocess.DEVNULL, env=TRACED)
        until(daemon.socket.exists)
        until(daemon.answers)
        client = daemon.connect()
        assert ask(client, frame(SET, b"/a", b"x")) == (0, b"")
        refused = [line for line in log.read_text().splitlines() if "EMFILE" in line]
        assert len(refused) == 4
    finally:
        os.kill(daemon.pid(), 15)
        daemon.process.wait(20)
        daemon.close()


# Documents


def send_document(client, request_bytes, *descriptors):
    client.sendmsg([request_bytes], [(socket.SOL_SOCKET, socket.SCM_RIGHTS, array.array("i", descriptors))])
    return receive(client)


def open_descriptors(daemon):
    return len(os.listdir(f"/proc/{daemon.pid()}/fd"))


def test_documents_travel_as_memory_files(daemon):
    client = daemon.connect()
    daemon.set("/a", "x")
    document = os.memfd_create("document")
    assert send_document(client, frame(LIST, b"/"), document) == (0, b"")
    assert os.pread(document, 100, 0) == b"/a=x\n"
    os.ftruncate(document, 0)
    os.lseek(document, 0, os.SEEK_SET)
    assert send_document(client, frame(DUMP), document) == (0, b"")
    ask(client, frame(SET, b"/a", b"y"))
    assert send_document(client, frame(LOAD), document) == (0, b"")
    assert daemon.listing() == ["/a=x"]
    os.ftruncate(document, 20)
    status, text = send_document(client, frame(LOAD), document)
    assert status == 3 and text.startswith(b"line 1: ")


@pytest.mark.parametrize("request_bytes, whole", [(frame(LIST, b"/"), b"/a=x\n"), (frame(DUMP), None)])
def test_a_document_that_was_filled_already_is_filled_anew(daemon, request_bytes, whole):
    """As a client passes it that had no reply the first time."""
    client = daemon.connect()
    daemon.set("/a", "x")
    document = os.memfd_create("document")
    assert send_document(client, request_bytes, document) == (0, b"")
    whole = whole or os.pread(document, 1000, 0)
    assert whole.count(b"x") >= 1
    for left in (b"", b"longer than anything that the daemon writes here" * 20):
        os.pwrite(document, left, 0)
        assert send_document(client, request_bytes, document) == (0, b"")
        assert os.pread(document, 1000, 0) == whole


def send_parts_at_once(daemon, client, *parts):
    """The parts are all there when the daemon looks; the kernel hands out the first, with a descriptor, by itself."""
    memory = os.memfd_create("memory")
    os.write(memory, b"<config><a>loaded</a></config>")
    os.kill(daemon.pid(), signal.SIGSTOP)
    client.sendmsg([parts[0]], [(socket.SOL_SOCKET, socket.SCM_RIGHTS, array.array("i", [memory]))])
    for part in parts[1:]:
        client.sendall(part)
    os.kill(daemon.pid(), signal.SIGCONT)
    os.close(memory)
    return receive(client)


def test_the_rest_of_a_request_may_come_behind_its_file(daemon):
    assert send_parts_at_once(daemon, daemon.connect(), frame(LOAD)[:3], frame(LOAD)[3:5], frame(LOAD)[5:]) == (0, b"")
    assert daemon.listing() == ["/a=loaded"]


def test_a_request_that_follows_one_with_a_file_ends_the_connection(daemon):
    assert send_parts_at_once(daemon, daemon.connect(), frame(LOAD), get_frame(b"/a")) is None
    assert daemon.listing() == []


@pytest.mark.native
def test_other_files_are_refused_and_closed(daemon, tmp_path):
    client = daemon.connect()
    reader, writer = os.pipe()
    plain = os.open("/proc/self/exe", os.O_RDONLY)
    ask(client, get_frame(b"/a"))
    before = open_descriptors(daemon)
    for operation in [DUMP, LOAD]:
        assert ask(client, frame(operation)) == (4, b"")
        for descriptor in [reader, writer, plain, client.fileno()]:
            assert send_document(client, frame(operation), descriptor) == (4, b"")
    memory = os.memfd_create("memory")
    # More than one, or one that the operation has no use for: none is kept.
    assert send_document(client, frame(DUMP), memory, memory, memory)[0] in (0, 4)
    assert send_document(client, get_frame(b"/a"), memory) == (1, b"")
    for _ in range(100):
        send_document(client, get_frame(b"/a"), *[memory] * 100)
    assert open_descriptors(daemon) == before


@pytest.mark.native
def test_the_file_of_a_request_that_never_ends_goes_with_its_client(daemon):
    before = open_descriptors(daemon)
    for _ in range(20):
        client = daemon.connect()
        memory = os.memfd_create("memory")
        client.sendmsg([frame(LOAD)[:5]], [(socket.SOL_SOCKET, socket.SCM_RIGHTS, array.array("i", [memory]))])
        os.close(memory)
        client.close()
    daemon.set("/a", "x")
    until(lambda: open_descriptors(daemon) <= before)


def test_a_large_document_is_loaded_and_the_memory_given_back(daemon):
    client = daemon.connect()
    memory = os.memfd_create("memory")
    os.write(memory, b"<config>" + b"".join(b"<a>%s</a>" % (b"<b>" + b"x" * 60000 + b"</b>") for _ in range(400)) +
             b"</config>")
    assert send_document(client, frame(LOAD), memory) == (0, b"")
    assert ask(client, get_frame(b"/a:400/b")) == (0, b"x" * 60000)
    os.ftruncate(memory, 0)
    os.pwrite(memory, b"<config/>", 0)
    assert send_document(client, frame(LOAD), memory) == (0, b"")
    assert daemon.listing() == []


@pytest.mark.unsanitized
@pytest.mark.native
def test_the_full_tree_is_small(daemon):
    """Eight targets and eight LUNs stay under 4 MB; the sanitizers' shadow is not the daemon's."""
    for target in range(1, 9):
        for key in ["target", "ip", "port", "chap", "chap_name", "chap_pwd", "conn_set", "conn_state", "status",
                    "lun/count", "lun/id:1/lun", "lun/id:1/share", "lun/id:1/enable", "lun/id:1/vol_access_right",
                    "lun/id:1/format_state", "lun/id:1/format_progress", "lun/id:1/volume_state", "lun/id:1/status",
                    "lun/id:1/size", "lun/id:1/fs_type", "lun/id:1/dev", "lun/id:1/mnt_dev", "lun/id:1/mnt"]:
            client = daemon.connect()
            assert ask(client, frame(SET, f"/iscsi/initiator/id:{target}/{key}".encode(), b"v" * 60)) == (0, b"")
    daemon.run("-D", "-")
    status = pathlib.Path(f"/proc/{daemon.pid()}/status").read_text()
    resident = int(status.split("VmRSS:")[1].split()[0])
    assert resident < 4096
