"""The daemon `ktree` and its command line client `ktreec`, as their users meet them."""
import base64
import fcntl
import os
import random
import re
import resource
import signal
import socket
import stat
import subprocess
import time

import pytest

from harness.ktree_daemon import KTREE, KTREEC, TRACED, Daemon, until


@pytest.fixture
def daemon():
    daemon = Daemon()
    yield daemon
    daemon.close()


@pytest.fixture
def place():
    """A daemon that is not started yet."""
    daemon = Daemon(start=False)
    yield daemon
    daemon.close()


def run(*args, **options):
    return subprocess.run(args, capture_output=True, text=True, timeout=60, **options)


# The daemon: start and end


def test_the_socket_is_private_and_the_pid_file_holds_the_number(daemon):
    info = daemon.socket.lstat()
    assert stat.S_ISSOCK(info.st_mode) and stat.S_IMODE(info.st_mode) == 0o600
    assert daemon.pid_file.read_text() == f"{daemon.process.pid}\n"
    assert stat.S_IMODE(daemon.pid_file.lstat().st_mode) == 0o600
    assert sorted(os.listdir(daemon.folder)) == ["sock", "sock_config.pid"]


def test_the_pid_file_carries_the_name():
    daemon = Daemon(name="other")
    try:
        assert (daemon.folder / "sock_other.pid").exists()
    finally:
        daemon.close()


@pytest.mark.parametrize("number", [signal.SIGTERM, signal.SIGINT])
def test_a_signal_ends_it_and_leaves_nothing(daemon, number):
    assert daemon.stop(number) == 0
    assert os.listdir(daemon.folder) == []


def test_sigint_ends_a_daemon_that_a_shell_started_in_the_background(place):
    # A shell has SIGINT ignored in what it starts with &.
    place.process = subprocess.Popen(["sh", "-c", f"{KTREE} -n config -s {place.socket} & wait"])
    until(place.pid_file.exists)
    until(place.answers)
    os.kill(place.pid(), signal.SIGINT)
    assert place.process.wait(20) == 0
    assert os.listdir(place.folder) == []


def test_the_end_of_a_terminal_does_not_end_it(daemon):
    daemon.process.send_signal(signal.SIGHUP)
    daemon.set("/a", "x")
    assert daemon.process.poll() is None


def test_it_starts_with_an_empty_tree(daemon):
    daemon.set("/a", "x")
    daemon.stop()
    daemon.start()
    assert daemon.listing() == []


def test_a_second_daemon_refuses_to_start(daemon):
    daemon.set("/a", "x")
    for name in ["config", "other"]:
        second = run(KTREE, "-n", name, "-s", daemon.socket)
        assert second.returncode == 1
        assert second.stderr == f"ktree: {daemon.socket}: another daemon listens on this socket\n"
    assert daemon.pid() == daemon.process.pid
    assert daemon.get("/a") == b"x"
    assert sorted(os.listdir(daemon.folder)) == ["sock", "sock_config.pid"]


def test_a_daemon_that_is_stopped_is_not_taken_for_a_dead_one(daemon):
    daemon.process.send_signal(signal.SIGSTOP)
    assert run(KTREE, "-n", "config", "-s", daemon.socket).returncode == 1
    daemon.process.send_signal(signal.SIGCONT)
    daemon.set("/a", "x")


def test_the_socket_of_a_dead_daemon_is_replaced(daemon):
    daemon.stop(signal.SIGKILL)
    assert daemon.socket.exists() and daemon.pid_file.exists()
    daemon.start()
    assert daemon.pid() == daemon.process.pid
    daemon.set("/a", "x")
    assert daemon.stop() == 0
    assert os.listdir(daemon.folder) == []


def test_a_file_that_is_no_socket_is_left_alone(place):
    place.socket.write_text("precious")
    done = run(KTREE, "-n", "config", "-s", place.socket)
    assert done.returncode == 1 and "not a socket" in done.stderr
    assert place.socket.read_text() == "precious"
    assert os.listdir(place.folder) == ["sock"]


def test_of_many_that_start_at_once_one_wins(place):
    starters = [subprocess.Popen([KTREE, "-n", f"n{i}", "-s", place.socket], stderr=subprocess.DEVNULL)
                for i in range(20)]
    until(lambda: sum(starter.poll() is None for starter in starters) <= 1)
    alive = [starter for starter in starters if starter.poll() is None]
    assert len(alive) == 1
    place.process = alive[0]
    assert all(starter.returncode == 1 for starter in starters if starter is not place.process)
    until(place.answers)
    names = set(os.listdir(place.folder)) - {"sock"}
    assert len(names) == 1
    assert (place.folder / names.pop()).read_text() == f"{place.process.pid}\n"
    assert place.stop() == 0
    assert os.listdir(place.folder) == []


def test_the_files_of_a_successor_are_left_alone(daemon):
    daemon.socket.unlink()
    daemon.pid_file.unlink()
    daemon.socket.write_text("another's")
    daemon.pid_file.write_text("another's")
    daemon.stop()
    assert daemon.socket.read_text() == "another's"
    assert daemon.pid_file.read_text() == "another's"


def test_the_files_of_a_successor_stay_however_long_the_end_takes(place):
    """The last of the files is removed a while later: the fifth removal, three belong to the start."""
    words = [KTREE, "-n", "config", "-s", place.socket]
    place.process = old = subprocess.Popen(
        ["strace", "-f", "-o", "/dev/null", "-e", "inject=unlinkat:delay_enter=1500000:when=5", *words], env=TRACED)
    until(place.answers)
    os.kill(place.pid(), signal.SIGTERM)
    while True:  # until one is not refused
        place.process = subprocess.Popen(words, stderr=subprocess.DEVNULL)
        try:
            place.process.wait(1)
        except subprocess.TimeoutExpired:
            break
    old.wait(20)
    assert place.answers() and place.pid_file.read_text() == f"{place.process.pid}\n"


def test_a_relative_path_does(place):
    place.process = subprocess.Popen([KTREE, "-n", "config", "-s", "sock"], cwd=place.folder)
    until(place.answers)
    assert place.pid() == place.process.pid
    place.stop()
    assert os.listdir(place.folder) == []


def test_places_it_cannot_use_are_named(place):
    long = place.folder / ("x" * 120)
    done = run(KTREE, "-n", "config", "-s", long)
    assert done.returncode == 1 and done.stderr == f"ktree: {long}: File name too long\n"
    missing = place.folder / "missing/sock"
    done = run(KTREE, "-n", "config", "-s", missing)
    assert done.returncode == 1 and done.stderr == f"ktree: {missing.parent}: No such file or directory\n"
    assert os.listdir(place.folder) == []


@pytest.mark.skipif(os.geteuid() != 0, reason="needs root to be somebody else")
def test_a_folder_that_it_may_not_write_to_is_named(place):
    done = run(for_nobody(place), "-n", "config", "-s", place.socket, user=65534, group=65534, extra_groups=[])
    assert done.returncode == 1 and done.stderr == f"ktree: {place.folder}: Permission denied\n"


def for_nobody(place):
    """A copy of the daemon, which anybody may run."""
    ktree = place.folder / "ktree"
    ktree.write_bytes(KTREE.read_bytes())
    ktree.chmod(0o755)
    return ktree


def start_as_nobody(place):
    os.chown(place.folder, 65534, 65534)
    place.folder.chmod(0o777)
    ktree = for_nobody(place)
    place.process = subprocess.Popen([ktree, "-n", "config", "-s", place.socket], user=65534, group=65534,
                                     extra_groups=[])
    until(place.answers)


def test_it_keeps_no_lock_of_the_process_that_started_it(place):
    lock = place.folder / "lock"
    with open(lock, "w") as held:
        fcntl.flock(held, fcntl.LOCK_EX)
        os.set_inheritable(held.fileno(), True)
        place.start(close_fds=False)
    with open(lock) as free:
        fcntl.flock(free, fcntl.LOCK_EX | fcntl.LOCK_NB)


def test_it_does_not_stay_in_the_folder_that_it_was_started_in(place):
    place.start(cwd=place.folder)
    assert os.readlink(f"/proc/{place.process.pid}/cwd") == "/"


@pytest.mark.skipif(os.geteuid() != 0, reason="needs root to be somebody else")
def test_it_writes_no_core(place):
    """What may leave none, not even to a program that takes cores, is root's in /proc: proc(5)."""
    start_as_nobody(place)
    assert os.stat(f"/proc/{place.pid()}/maps").st_uid == 0


def test_it_raises_its_own_limit_of_descriptors(place):
    place.start(prefix=["prlimit", "--nofile=64:512"])
    assert resource.prlimit(place.process.pid, resource.RLIMIT_NOFILE) == (512, 512)


def settings(value):
    return f"<config><a>{value}</a></config>"


def started_with(place, *files):
    """Starts the daemon with these settings files; gives what it says."""
    arguments = [word for file in files for word in ("-l", place.folder / file)]
    with open(place.folder / "said", "w+") as said:
        place.start(arguments=arguments, stderr=said)
        said.seek(0)
        return said.read().replace(f"{place.folder}/", "")


def test_it_starts_with_the_settings_of_a_file(place):
    (place.folder / "vv.xml").write_text(settings("saved"))
    (place.folder / "copy").write_text(settings("copy"))
    assert started_with(place, "vv.xml", "copy") == ""
    assert place.get("/a") == b"saved"
    assert "vv.xml.damaged" not in os.listdir(place.folder)


@pytest.mark.parametrize("damaged, reason", [
    (None, "No such file or directory"), ("", "line 1: no element found"), ("<config><a>", "line 1: no element found"),
    ("rubbish", "line 1: syntax error")])
def test_it_starts_with_the_next_file_and_keeps_the_damaged_one(place, damaged, reason):
    (place.folder / "copy").write_text(settings("copy"))
    if damaged is not None:
        (place.folder / "vv.xml").write_text(damaged)
    assert started_with(place, "vv.xml", "copy") == f"ktree: vv.xml: {reason}\nktree: loaded copy instead\n"
    assert place.get("/a") == b"copy"
    kept = place.folder / "vv.xml.damaged"
    assert (kept.read_text() if kept.exists() else None) == damaged
    assert place.run("-D", place.folder / "vv.xml").returncode == 0
    assert (kept.read_text() if kept.exists() else None) == damaged


def test_a_second_daemon_touches_no_settings(daemon):
    file, kept = daemon.folder / "vv.xml", daemon.folder / "vv.xml.damaged"
    file.write_text("rubbish")
    kept.write_text("kept before")
    second = run(KTREE, "-n", "config", "-s", daemon.socket, "-l", file)
    assert second.returncode == 1
    assert second.stderr == f"ktree: {daemon.socket}: another daemon listens on this socket\n"
    assert kept.read_text() == "kept before"


def test_without_any_settings_it_starts_empty(place):
    os.mkfifo(place.folder / "fifo")
    (place.folder / "torn").write_text("<config>")
    assert started_with(place, "none", "fifo", "torn").splitlines() == [
        "ktree: none: No such file or directory", "ktree: fifo: not a regular file", "ktree: torn: line 1: no element found"]
    assert place.listing() == []


def test_nobody_gets_an_answer_before_the_settings_are_loaded(place):
    """The settings file is read before the socket is there."""
    (place.folder / "vv.xml").write_text(settings("saved"))
    log = place.folder / "log"
    place.start(prefix=["strace", "-o", log, "-e", "trace=openat,socket,bind,listen"], env=TRACED,
                arguments=["-l", place.folder / "vv.xml"])
    calls = log.read_text()
    assert 0 < calls.index(str(place.folder / "vv.xml")) < calls.index("bind(")
    os.kill(place.pid(), signal.SIGTERM)  # strace would let go of it
    place.process.wait(20)


def test_whoever_sees_the_socket_is_answered(place):
    place.process = subprocess.Popen(["strace", "-f", "-o", "/dev/null", "-e", "inject=listen:delay_enter=500000",
                                      KTREE, "-n", "config", "-s", place.socket], env=TRACED)
    until(place.socket.exists)
    assert place.run("-t").returncode == 0
    os.kill(place.pid(), signal.SIGTERM)
    place.process.wait(20)
    assert os.listdir(place.folder) == []


@pytest.mark.parametrize("fault", ["listen:error=EADDRINUSE", "renameat:error=EIO:when=1", "renameat:error=EIO:when=2"])
def test_a_start_that_fails_leaves_no_file(place, fault):
    done = subprocess.run(["strace", "-o", "/dev/null", "-e", f"inject={fault}", KTREE, "-n", "config", "-s", place.socket],
                          env=TRACED, capture_output=True, timeout=60)
    assert done.returncode == 1
    assert os.listdir(place.folder) == []


def test_what_a_killed_start_left_is_no_hindrance(place):
    (place.folder / "sock.new").touch()
    (place.folder / "sock_config.pid.new").touch()
    place.start()
    assert sorted(os.listdir(place.folder)) == ["sock", "sock_config.pid"]


def test_the_service_manager_is_told_when_it_answers(place):
    with socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM) as manager:
        manager.bind(str(place.folder / "notify"))
        manager.settimeout(20)
        place.process = subprocess.Popen([KTREE, "-n", "config", "-s", place.socket],
                                         env={**os.environ, "NOTIFY_SOCKET": str(place.folder / "notify")})
        assert manager.recv(100) == b"READY=1"
        assert place.answers()


def lock_file_for_others(folder):
    lock = folder / "sock.lock"
    lock.touch(0o644)
    return lock


def link_in_place_of_the_lock_file(folder):
    precious = folder / "precious"
    precious.touch(0o600)
    (folder / "sock.lock").symlink_to(precious)
    return precious


def pipe_in_place_of_the_lock_file(folder):
    os.mkfifo(folder / "sock.lock")
    return folder


# Each makes in the socket's folder what others can lock, and returns it.
OTHERS = {
    "a folder that others lock": lambda folder: folder,
    "a lock file that others may open": lock_file_for_others,
    "a link": link_in_place_of_the_lock_file,
    "a pipe": pipe_in_place_of_the_lock_file,
}


@pytest.mark.parametrize("make", OTHERS.values(), ids=OTHERS)
def test_what_others_lock_does_not_keep_it_from_starting(place, make):
    holder = os.open(make(place.folder), os.O_RDONLY)
    fcntl.flock(holder, fcntl.LOCK_EX)
    begun = time.monotonic()
    place.start()
    assert time.monotonic() - begun < 3
    os.close(holder)
    assert sorted(set(os.listdir(place.folder)) - {"precious"}) == ["sock", "sock_config.pid"]


def test_one_that_is_starting_is_waited_for(place):
    lock = place.folder / "sock.lock"
    lock.touch(0o600)
    holder = os.open(lock, os.O_RDWR)
    fcntl.flock(holder, fcntl.LOCK_EX)
    second = subprocess.Popen([KTREE, "-n", "config", "-s", place.socket])
    time.sleep(0.5)
    assert not place.socket.exists()
    lock.unlink()
    os.close(holder)
    place.process = second
    until(lambda: place.socket.exists() and place.answers())


@pytest.mark.parametrize("arguments", [[], ["-n", "x"], ["-s", "/tmp/x"], ["-n", "a/b", "-s", "/tmp/x"],
                                       ["-n", "", "-s", "/tmp/x"], ["-n", "x", "-s", ""], ["-n", "x", "-s", "y", "z"],
                                       ["-z"], ["--nix"]])
def test_bad_usage_of_the_daemon(arguments):
    done = run(KTREE, *arguments)
    assert done.returncode == 2 and done.stdout == ""
    assert "Usage: ktree -n NAME -s SOCKET [-l FILE]...\n" in done.stderr


@pytest.mark.parametrize("program", [KTREE, KTREEC])
def test_help_and_version(program):
    done = run(program, "--help")
    assert done.returncode == 0 and done.stdout.startswith(f"Usage: {program.name} ") and done.stderr == ""
    done = run(program, "--version")
    assert done.returncode == 0 and re.fullmatch(rf"{program.name} \d+\.\d+\.\d+\n", done.stdout) and done.stderr == ""


# Who may talk to it


def as_nobody(code, *args):
    return run("/usr/bin/python3", "-c", code, *args, user=65534, group=65534, extra_groups=[])


TALK = """
import socket, sys
client = socket.socket(socket.AF_UNIX)
client.settimeout(20)
try:
    client.connect(sys.argv[1])
except PermissionError:
    sys.exit("refused")
try:
    client.sendall(bytes.fromhex("0a000000 01000200 2f61 ffff0000"))
    print(client.recv(100))
except (BrokenPipeError, ConnectionResetError):
    print(b"")
"""


@pytest.mark.skipif(os.geteuid() != 0, reason="needs root to be somebody else")
def test_the_socket_lets_no_other_user_in(daemon):
    assert as_nobody(TALK, daemon.socket).stderr == "refused\n"


@pytest.mark.skipif(os.geteuid() != 0, reason="needs root to be somebody else")
def test_another_user_gets_no_answer_even_past_the_mode_of_the_socket(daemon):
    daemon.set("/a", "secret")
    daemon.socket.chmod(0o666)
    assert as_nobody(TALK, daemon.socket).stdout == "b''\n"
    assert daemon.get("/a") == b"secret"


@pytest.mark.skipif(os.geteuid() != 0, reason="needs root to be somebody else")
def test_the_owner_and_root_are_let_in(place):
    start_as_nobody(place)
    place.set("/a", "x")
    assert as_nobody(TALK, place.socket).stdout == f"{bytes.fromhex('05000000 00000000') + b'x'}\n"


# The client tool


def test_get_prints_the_value_and_a_newline(daemon):
    daemon.set("/a/b:2", "two\nlines")
    done = daemon.run("-g", "/a/b:2")
    assert (done.returncode, done.stdout, done.stderr) == (0, b"two\nlines\n", b"")


def test_get_of_an_empty_value_prints_the_newline_alone(daemon):
    daemon.set("/a", "")
    done = daemon.run("-g", "/a")
    assert (done.returncode, done.stdout) == (0, b"\n")


@pytest.mark.parametrize("path", ["/b", "/a:2", "/dir", "/a/b", "nonsense", "/a:0", "/"])
def test_get_of_nothing_prints_nothing(daemon, path):
    daemon.set("/a", "x")
    daemon.set("/dir/x", "y")
    done = daemon.run("-g", path)
    assert (done.returncode, done.stdout) == (1, b"")


def test_values_of_every_kind_go_through(daemon):
    for value in [b"-g", b"--help", b" ", bytes(range(1, 256)), b"x" * 65535, "ä€😀".encode()]:
        assert daemon.run("-s", "/v", value).returncode == 0
        assert daemon.get("/v") == value


def test_what_a_tree_cannot_take_is_refused_and_changes_nothing(daemon):
    daemon.set("/a", "old")
    for path in ["", "/", "a", "/a/", "/a//b", "/a:0", "/a:01", "/a:4097", "/b/c:99999999999999999999", "/b/1", "/" +
                 "x" * 1023]:
        done = daemon.run("-s", path, "new")
        assert (done.returncode, done.stdout) == (1, b""), path
        assert done.stderr.count(b"\n") == 1
    assert daemon.run("-s", "/a", "x" * 65536).returncode == 1
    assert daemon.listing() == ["/a=old"]


def test_delete(daemon):
    for n in "123":
        daemon.set(f"/id:{n}/target", n)
    assert daemon.run("-d", "/id:2").returncode == 0
    assert daemon.listing() == ["/id:1/target=1", "/id:2/target=3"]
    for path in ["/id:3", "/nix", "/", "bad"]:
        assert daemon.run("-d", path).returncode == 1
    assert daemon.listing() == ["/id:1/target=1", "/id:2/target=3"]


def test_listing(daemon):
    daemon.set("/z/id/lun:2", "a\tb\\")
    daemon.set("/a", "")
    whole = ["/z/id:1/lun:2=a\\x09b\\x5C", "/a="]
    assert daemon.listing() == whole
    assert daemon.listing("/") == whole
    assert daemon.listing("/z") == whole[:1]
    assert daemon.listing("/a") == ["/a="]
    for path in ["/nix", "/a:2", "bad"]:
        done = daemon.run("-t", path)
        assert (done.returncode, done.stdout) == (1, b"")


def test_the_socket_may_come_last(daemon):
    daemon.set("/a", "x")
    done = run(KTREEC, "-g", "/a", "-S", daemon.socket)
    assert (done.returncode, done.stdout) == (0, "x\n")


@pytest.mark.parametrize("arguments", [[], ["-S"], ["-S", "x"], ["-g"], ["-s", "/a"], ["-s"], ["-d"], ["-l"], ["-D"],
                                       ["-x"], ["-g", "/a", "-g", "/a"], ["-g", "/a", "/b"], ["-t", "/a", "/b"],
                                       ["get", "/a"], ["--nix"]])
def test_bad_usage_of_the_client(arguments):
    done = run(KTREEC, *arguments)
    assert done.returncode == 2 and done.stdout == ""
    assert done.stderr.startswith("ktreec: ") and done.stderr.count("\n") == 1


@pytest.mark.parametrize("arguments", [["-g", "/a"], ["-s", "/a", "x"], ["-d", "/a"], ["-t"], ["-D", "-"]])
def test_a_daemon_that_cannot_be_reached(place, arguments):
    place.folder.joinpath("file").write_text("")
    for target in [place.socket, place.folder / "file", place.folder / ("x" * 200)]:
        done = run(KTREEC, "-S", target, *arguments)
        assert (done.returncode, done.stdout) == (3, "")
        assert done.stderr == f"ktreec: {target}: the daemon cannot be reached\n"


def test_a_full_standard_output_is_a_failure(daemon):
    daemon.set("/a", "x")
    for arguments in [["-g", "/a"], ["-t"], ["-D", "-"]]:
        with open("/dev/full", "w") as full:
            done = subprocess.run([KTREEC, "-S", daemon.socket, *arguments], stdout=full, stderr=subprocess.PIPE,
                                  timeout=60)
        assert done.returncode == 1 and b"No space left on device" in done.stderr, arguments


@pytest.mark.parametrize("arguments", ["-g /a", "-t", "-D -", "-D vv.xml"])
def test_without_standard_descriptors_nothing_goes_astray(daemon, arguments):
    daemon.set("/a", "x")
    status = run("sh", "-c", f"{KTREEC} -S {daemon.socket} {arguments} <&- >&- 2>&-", cwd=daemon.folder).returncode
    file = daemon.folder / "vv.xml"
    if file.exists():
        assert status == 0 and file.read_bytes() == daemon.run("-D", "-").stdout
    else:
        assert status == 1
    assert daemon.listing() == ["/a=x"]


# Dump and load


def test_a_dump_is_private_whatever_the_mask_and_the_old_file(daemon):
    daemon.set("/a", "x")
    file = daemon.folder / "vv.xml"
    for mask, before in [(0, None), (0o777, None), (0, 0o666)]:
        if before is not None:
            file.chmod(before)
        assert daemon.run("-D", file, umask=mask).returncode == 0
        assert stat.S_IMODE(file.stat().st_mode) == 0o600
        assert file.read_bytes() == daemon.run("-D", "-").stdout


def test_a_dump_goes_to_the_folder_of_the_caller(daemon):
    daemon.set("/a", "x")
    assert daemon.run("-D", "vv.xml", cwd=daemon.folder).returncode == 0
    assert daemon.run("-l", "vv.xml", cwd=daemon.folder).returncode == 0
    assert daemon.get("/a") == b"x"


def test_a_dump_replaces_a_link_and_leaves_its_target(daemon):
    target = daemon.folder / "target"
    target.write_text("precious")
    link = daemon.folder / "vv.xml"
    link.symlink_to(target)
    assert daemon.run("-D", link).returncode == 0
    assert target.read_text() == "precious" and not link.is_symlink()


def test_a_dump_replaces_no_device_and_no_folder(daemon):
    device = daemon.folder / "device"
    link = daemon.folder / "link"
    os.mkfifo(device)
    link.symlink_to("/dev/null")
    def what_it_is(path):
        info = path.lstat()
        return info.st_ino, info.st_mode, info.st_mtime_ns  # a look alone changes the time of the last access

    for target in [device, link, daemon.folder]:
        before = what_it_is(target)
        done = daemon.run("-D", target)
        assert done.returncode == 1 and done.stderr.startswith(b"ktreec: ")
        assert what_it_is(target) == before
    assert sorted(os.listdir(daemon.folder)) == ["device", "link", "sock", "sock_config.pid"]


def test_a_dump_that_cannot_be_written_says_why(daemon):
    done = daemon.run("-D", daemon.folder / "missing/vv.xml")
    assert done.returncode == 1 and done.stderr.endswith(b": No such file or directory\n")


def test_load_makes_the_tree_what_the_file_holds(daemon):
    daemon.set("/a/b", "x")
    daemon.set("/c", "")
    daemon.set("/id:3", "y")
    before = daemon.listing()
    file = daemon.folder / "vv.xml"
    daemon.run("-D", file)
    daemon.set("/more", "z")
    daemon.run("-d", "/a")
    assert daemon.run("-l", file).returncode == 0
    assert daemon.listing() == before


@pytest.mark.parametrize("text, message", [
    ("", "line 1: no element found"),
    ("<config>\n <a>1</a>\n", "line 3: no element found"),
    ("<config>\n <a:2>1</a:2>\n</config>", "line 2: a name that is not allowed"),
    ("plain text", "line 1: syntax error"),
    ("<config>\n" + "<id/>\n" * 4097 + "</config>",
     "line 4098: more than 4096 elements of one name, or a tree that is too large"),
], ids=["empty", "cut", "number", "text", "too many"])
def test_a_damaged_file_leaves_the_tree_as_it_was_and_says_the_line(daemon, text, message):
    daemon.set("/a", "old")
    file = daemon.folder / "vv.xml"
    file.write_text(text)
    done = daemon.run("-l", file)
    assert (done.returncode, done.stderr.decode()) == (1, f"ktreec: {file}: {message}\n")
    assert daemon.listing() == ["/a=old"]


def test_files_that_cannot_be_loaded(daemon):
    daemon.set("/a", "old")
    fifo = daemon.folder / "fifo"
    os.mkfifo(fifo)
    for target, reason in [(daemon.folder / "nix", "No such file or directory"), (daemon.folder, "Is a directory"),
                           (fifo, "Invalid argument"), ("/dev/zero", "Invalid argument")]:
        done = daemon.run("-l", target)
        assert (done.returncode, done.stderr.decode()) == (1, f"ktreec: {target}: {reason}\n")
    assert daemon.listing() == ["/a=old"]


# A dump that dies or fails at any step. The names are those that the C library uses on this kind of machine.
STEPS = ["memfd_create", "sendmsg", "recvmsg", "openat", "fchmod", "pread64", "write", "fsync", "close", "rename"]


def traced_dump(daemon, file, inject):
    return subprocess.run(["strace", "-f", "-o", "/dev/null", "-e", "trace=" + ",".join(STEPS), "-e", f"inject={inject}",
                           KTREEC, "-S", daemon.socket, "-D", file], capture_output=True, env=TRACED, timeout=60)


@pytest.mark.parametrize("step", STEPS)
def test_a_dump_that_dies_at_any_moment_leaves_the_old_file_or_the_new_one(daemon, step):
    file = daemon.folder / "vv.xml"
    daemon.set("/a", "old")
    daemon.run("-D", file)
    old = file.read_bytes()
    daemon.set("/a", "new")
    new = daemon.run("-D", "-").stdout
    deaths = 0
    while True:
        file.write_bytes(old)
        done = traced_dump(daemon, file, f"{step}:signal=SIGKILL:when={deaths + 1}")
        if done.returncode == 0:
            break
        deaths += 1
        assert file.read_bytes() in (old, new)
    assert deaths > 0
    assert file.read_bytes() == new


@pytest.mark.parametrize("fault", ["memfd_create:error=ENFILE", "fchmod:error=EIO",
                                   "write:error=ENOSPC", "write:error=EIO", "fsync:error=EIO:when=1",
                                   "rename:error=EIO"])
def test_a_dump_that_fails_at_any_step_leaves_the_old_file_alone(daemon, fault):
    file = daemon.folder / "vv.xml"
    file.write_text("old")
    daemon.set("/a", "new")
    # The message on standard error is a write, too.
    done = traced_dump(daemon, file, fault if "when" in fault else f"{fault}:when=1")
    assert done.returncode == 1
    assert file.read_text() == "old"
    assert sorted(os.listdir(daemon.folder)) == ["sock", "sock_config.pid", "vv.xml"]


def test_a_dump_is_on_the_disk_before_it_gets_the_name_and_the_folder_after_it(daemon):
    daemon.set("/a", "new")
    log = daemon.folder.parent / f"{daemon.folder.name}.log"
    run("strace", "-y", "-o", log, "-e", "trace=fsync,fdatasync,rename,renameat,renameat2", KTREEC, "-S", daemon.socket,
        "-D", daemon.folder / "vv.xml", env=TRACED, check=True)
    lines = log.read_text().splitlines()
    log.unlink()
    assert [line.split("(")[0] for line in lines[:3]] == ["fsync", "rename", "fsync"]
    assert ".tmp>" in lines[0] and f"{daemon.folder}>" in lines[2]


def test_a_dump_that_changes_nothing_writes_nothing_and_is_on_the_disk(daemon):
    daemon.set("/a", "x" * 40000)
    file = daemon.folder / "vv.xml"
    assert daemon.run("-D", file).returncode == 0
    before = file.stat()
    log = daemon.folder.parent / f"{daemon.folder.name}.log"
    run("strace", "-y", "-o", log, "-e", "trace=fsync,rename,write", KTREEC, "-S", daemon.socket, "-D", file, env=TRACED,
        check=True)
    lines = [line for line in log.read_text().splitlines() if not line.startswith("+++")]
    log.unlink()
    assert [line.split("(")[0] for line in lines] == ["fsync", "fsync"]
    assert f"{file}>" in lines[0] and f"{daemon.folder}>" in lines[1]
    after = file.stat()
    assert (after.st_ino, after.st_ctime_ns) == (before.st_ino, before.st_ctime_ns)


def another_text(file):
    data = file.read_bytes()
    file.write_bytes(data.replace(b"x</a>", b"y</a>"))


def another_length(file):
    with file.open("ab") as end:
        end.write(b"\n")


def another_name(file):
    file.with_name("second").hardlink_to(file)


def behind_a_link(file):
    file.rename(file.with_name("target"))
    file.symlink_to("target")


@pytest.mark.parametrize("change", [another_text, another_length, another_name, behind_a_link, os.unlink,
                                    lambda file: file.chmod(0o640), lambda file: os.chown(file, 1, 1)],
                         ids=["text", "length", "name", "link", "gone", "mode", "owner"])
def test_a_dump_replaces_what_is_not_its_own_work_any_more(daemon, change):
    daemon.set("/a", "x" * 40000)
    file = daemon.folder / "vv.xml"
    assert daemon.run("-D", file).returncode == 0
    with file.open() as keep:  # nobody gets its number
        before = os.stat(keep.fileno()).st_ino
        change(file)
        assert daemon.run("-D", file).returncode == 0
    info = file.lstat()
    assert info.st_ino != before and stat.S_IMODE(info.st_mode) == 0o600 and info.st_uid == os.geteuid()
    assert stat.S_ISREG(info.st_mode) and info.st_nlink == 1
    assert file.read_bytes() == daemon.run("-D", "-").stdout


def test_a_file_that_its_disk_does_not_take_is_written_anew(daemon):
    daemon.set("/a", "x")
    file = daemon.folder / "vv.xml"
    assert daemon.run("-D", file).returncode == 0
    with file.open() as keep:
        before = os.stat(keep.fileno()).st_ino
        assert traced_dump(daemon, file, "fsync:error=EIO:when=1").returncode == 0
        assert file.stat().st_ino != before


def test_what_no_dump_takes_the_place_of(daemon):
    (daemon.folder / "folder").mkdir()
    os.mkfifo(daemon.folder / "fifo")
    for name, reason in [("folder", "Is a directory"), ("fifo", "Invalid argument")]:
        done = daemon.run("-D", daemon.folder / name)
        assert (done.returncode, done.stderr.decode()) == (1, f"ktreec: {daemon.folder / name}: {reason}\n")
    assert sorted(os.listdir(daemon.folder)) == ["fifo", "folder", "sock", "sock_config.pid"]


def test_a_dump_leaves_nothing_open(daemon):
    daemon.set("/a", "new")
    log = daemon.folder.parent / f"{daemon.folder.name}.log"
    run("strace", "-y", "-o", log, "-e", "trace=openat,close", KTREEC, "-S", daemon.socket, "-D",
        daemon.folder / "vv.xml", env=TRACED, check=True)
    lines = [line for line in log.read_text().splitlines() if str(daemon.folder) in line]
    log.unlink()
    opened = [re.sub(r"\.\d+\.tmp>", ">", line.rpartition("= ")[2])  # it has its name when it is closed
              for line in lines if line.startswith("openat") and "= -1" not in line]
    closed = [line.partition("(")[2].partition(">")[0] + ">" for line in lines if line.startswith("close")]
    assert len(opened) == 3  # the folder for what was left there, the new file, the folder to be written out
    assert sorted(closed) == sorted(opened)


def test_what_killed_dumps_left_is_removed_by_the_next(daemon):
    file = daemon.folder / "vv.xml"
    daemon.set("/a", "secret")
    assert traced_dump(daemon, file, "fsync:signal=SIGKILL:when=1").returncode != 0
    assert [name for name in os.listdir(daemon.folder) if name.endswith(".tmp")]
    (daemon.folder / "vv.xml.77.tmp").touch()
    kept = ["other.xml.77.tmp", "vv.xml.7x.tmp", "vv.xml..tmp", "vv.xml.77.tmp~", "vv.xml.78.tmp", "vv.xml.79.tmp"]
    for name in kept[:-2]:
        (daemon.folder / name).touch()
    (daemon.folder / "vv.xml.78.tmp").mkdir()
    os.mkfifo(daemon.folder / "vv.xml.79.tmp")
    assert daemon.run("-D", file).returncode == 0
    assert sorted(os.listdir(daemon.folder)) == sorted(["sock", "sock_config.pid", "vv.xml", *kept])


@pytest.mark.parametrize("step", ["fsync", "rename"])
def test_what_a_living_dump_writes_is_left_to_it(daemon, step):
    file = daemon.folder / "vv.xml"
    daemon.set("/a", "new")
    slow = subprocess.Popen(["strace", "-f", "-o", "/dev/null", "-e", f"trace={step}", "-e",
                             f"inject={step}:delay_enter=1500000:when=1", KTREEC, "-S", daemon.socket, "-D", file],
                            env=TRACED)
    until(lambda: [name for name in os.listdir(daemon.folder) if name.endswith(".tmp")])
    assert daemon.run("-D", file).returncode == 0
    assert [name for name in os.listdir(daemon.folder) if name.endswith(".tmp")]
    assert slow.wait(20) == 0
    assert sorted(os.listdir(daemon.folder)) == ["sock", "sock_config.pid", "vv.xml"]


def test_a_temporary_file_of_the_same_name_is_in_nobodys_way(daemon):
    # The name holds the number of the process, which exec keeps.
    target = daemon.folder / "precious"
    target.write_text("precious")
    script = f'ln -s {target} vv.xml.$$.tmp; exec {KTREEC} -S {daemon.socket} -D vv.xml'
    assert run("sh", "-c", script, cwd=daemon.folder).returncode == 0
    assert target.read_text() == "precious"
    assert sorted(os.listdir(daemon.folder)) == ["precious", "sock", "sock_config.pid", "vv.xml"]


# Another reader


def canonical_values(file):
    """The values of a settings file as libxml2 sees them: its canonical form is simple enough to take apart here."""
    text = run("xmllint", "--c14n", file, check=True).stdout
    values, stack, position = [], [], 0
    while position < len(text):
        if text[position] == "<":
            end = text.index(">", position)
            tag = text[position + 1:end]
            if tag.startswith("/"):
                node = stack.pop()
                values.append((len(stack), node))
            elif not tag.startswith("?"):
                name, _, attributes = tag.partition(" ")
                if stack:
                    stack[-1]["children"] += 1
                stack.append({"name": name, "attributes": attributes, "text": "", "children": 0})
            position = end + 1
        else:
            end = text.find("<", position)
            end = len(text) if end < 0 else end
            if stack:
                part = text[position:end]
                for escape, char in [("&lt;", "<"), ("&gt;", ">"), ("&#xD;", "\r"), ("&amp;", "&")]:
                    part = part.replace(escape, char)
                stack[-1]["text"] += part
            position = end
    return [node for depth, node in values if depth == 1]


def test_another_reader_sees_the_same_values(daemon):
    random.seed(1)
    pieces = [" ", "\n", "\r", "\t", "&", "<", ">", "]]>", "x", "\x01", "\x7f", "ä", "€", "😀", "\ufffe"]
    values = ["".join(random.choices(pieces, k=random.randrange(6))).encode() for _ in range(60)]
    values += [bytes(random.randrange(1, 256) for _ in range(8)) for _ in range(20)]
    for i, value in enumerate(values):
        assert daemon.run("-s", f"/v:{i + 1}", value).returncode == 0
    file = daemon.folder / "vv.xml"
    assert daemon.run("-D", file).returncode == 0
    nodes = canonical_values(file)
    assert len(nodes) == len(values)
    for node, value in zip(nodes, values):
        text = node["text"].encode()
        assert node["name"] == "v" and node["children"] == 0
        assert (base64.b64decode(text) if node["attributes"] == 'encoding="base64"' else text) == value
