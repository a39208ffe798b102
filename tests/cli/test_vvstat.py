"""vvstat: how the volumes are, for an operator and for programs."""

import contextlib
import datetime
import fcntl
import json
import os
import pathlib
import re
import signal
import struct
import subprocess
import time
import unicodedata

import jsonschema
import prometheus_client.parser
import pytest

from harness.documents import strict_schema
from harness.initiator import store
from harness.terminal import Terminal

SCHEMA = strict_schema("vvstat.schema.json")
T1, T2 = "/iscsi/initiator/id:1", "/iscsi/initiator/id:2"
T1_NAME = "iqn.2026-01.org.example:t1"
LONG_NAME = "iqn.2026-01.org.example:a-target-whose-name-has-a-length-as-in-life"

MANY = 1_000_000  # allocations

TABLE = """\
SHARE        STATUS         USED SIZE USE% LUN PORTAL
Backup       Running        1.5M  20M    8   0 10.9.0.2:3260
Fotos 日本   Running          0B  20M    0   1 10.9.0.2:3260
             Disconnected                      [fe80::1]:3261

all 2 healthy, 1 not wanted, as of CLOCK
"""


def run(box, *command):
    done = box.run(list(command), env={"LD_PRELOAD": None})
    assert done.status == 0, done.stderr


def vvstat(box, *options, env=None, **more):
    return box.run(["vvstat", *options], env={"LD_PRELOAD": None, **(env or {})}, **more)


def volumes(box, *options):
    """What the JSON says, after a comparison with its schema."""
    told = json.loads(vvstat(box, "--json", *options).stdout)
    jsonschema.validate(told, SCHEMA)
    return told["volumes"]


def without_clock(text):
    return re.sub(r"as of \d\d:\d\d:\d\d$", "as of CLOCK", text, flags=re.M)


def width(line):
    return sum(2 if unicodedata.east_asian_width(c) in "WF" else 1 for c in line)


def mount(box, place, *options):
    box.path(place).mkdir(parents=True, exist_ok=True)
    run(box, "/bin/mount", "-t", "tmpfs", "-o", ",".join(["size=20m", *options]), "volume", place)


def session(box, number, target, state="LOGGED_IN", address="10.9.0.2"):
    box.write(f"/sys/class/iscsi_session/session{number}/targetname", target + "\n")
    box.write(f"/sys/class/iscsi_session/session{number}/state", state + "\n")
    box.write(f"/sys/class/iscsi_connection/connection{number}:0/persistent_address", address + "\n")


def store_example(box):
    idle = {"fs_type": "ext4", "format_state": 0, "volume_state": 0, "status": "Running"}
    store(box, T1_NAME, conn_set=1, conn_state=1, status="Connected", chap_name="user", chap_pwd="canary-secret",
          luns=[("Backup", 0, {**idle, "size": "1/2", "dev": "sdb", "mnt": "/mnt/VV/Backup"}),
                ("Fotos 日本", 1, {**idle, "size": "0/0", "dev": "sdc", "mnt": "/mnt/VV/Fotos 日本"})])
    store(box, "iqn.t2", slot=2, ip="[fe80::1]", port=3261, conn_set=0, conn_state=0, status="Disconnected")


@pytest.fixture
def example(box):
    """Two volumes of one target, mounted, and a target that nobody wants to be connected."""
    run(box, "/bin/mount", "-t", "tmpfs", "class", "/sys/class")
    store_example(box)
    session(box, 3, T1_NAME)
    mount(box, "/mnt/VV/Backup")
    mount(box, "/mnt/VV/Fotos 日本")
    box.write("/mnt/VV/Backup/file", b"x" * (3 << 19))
    return box


def test_the_table(example):
    done = vvstat(example)
    assert (done.status, without_clock(done.stdout), done.stderr) == (0, TABLE, "")


def test_it_changes_nothing(example):
    before = example.tree.dump()
    vvstat(example)
    vvstat(example, "--json")
    assert example.tree.dump() == before
    assert not example.runs("iscsiadm") and not example.trace("run")


def test_a_tree_without_targets(box):
    done = vvstat(box)
    assert (done.status, without_clock(done.stdout)) == (0, "no volumes are configured, as of CLOCK\n")
    assert volumes(box) == []


def test_without_the_tree(box):
    box.tree.stop()
    for options in ([], ["--json"], ["-x"], ["Backup"]):
        done = vvstat(box, *options)
        assert (done.status, done.stdout) == (3, "")
        assert done.stderr == "vvstat: the configuration tree cannot be reached; see systemctl status remvol-tree\n"


def test_somebody_who_may_not_read_the_tree_is_told(example):
    done = example.run(["/usr/bin/setpriv", "--reuid=65534", "--regid=65534", "--clear-groups", "vvstat"],
                       env={"LD_PRELOAD": None})
    assert (done.status, done.stdout) == (3, "")
    assert done.stderr == "vvstat: only root may read the configuration tree\n"


# --- what is wrong ---

CONNECT = "vv connect Backup"
MOUNT_ANEW = f"vv disconnect Backup && {CONNECT}"
BECAME_READ_ONLY = "became read-only: its file system has errors, or the LUN was write-protected"
FORMAT = "vv format --destroy-data Backup"
HEALS = "look at the network and the storage server; it heals by itself"

# Values of the tree, what it is to show of the first volume: status, problem, command.
TREE_PROBLEMS = [
    ({"conn_state": "0"}, "Disconnected", "is not connected", CONNECT),
    ({"conn_state": ""}, "Disconnected", "is not connected", CONNECT),
    ({"conn_state": "2"}, "Connecting", "is being connected", None),
    ({"conn_state": "3"}, "Reconnecting", "the connection was lost", None),
    ({"conn_state": "4"}, "Connect Error", "the login failed", CONNECT),
    ({"lun/id:1/format_state": "1", "lun/id:1/format_progress": "37", "lun/id:1/status": "Formatting 37%"},
     "Formatting 37%", "is being formatted, 37%", None),
    ({"lun/id:1/format_state": "4", "lun/id:1/status": "Wait to Format"}, "Wait to Format",
     "waits until another volume is formatted", None),
    ({"lun/id:1/volume_state": "1", "lun/id:1/status": "Creating Volume"}, "Creating Volume", "is being created", None),
    # A connection that somebody asked for and that failed is not stored as one that is wanted.
    ({"conn_set": "0", "conn_state": "4"}, "Connect Error", "the login failed", CONNECT),
    ({"conn_set": "0", "conn_state": "2"}, "Connecting", "is being connected", None),
    ({"conn_set": "0", "lun/id:1/format_state": "4", "lun/id:1/status": "Wait to Format"}, "Wait to Format",
     "waits until another volume is formatted", None),
    # Nor is one that was given up at start-up.
    ({"conn_set": "0", "conn_state": "0", "lun/id:1/volume_state": "4"}, "Given Up",
     "was given up at start-up: its target showed no disk", CONNECT),
]
UNMOUNTED_PROBLEMS = [
    ({}, "Not Mounted", "is not mounted", CONNECT),
    ({"lun/id:1/volume_state": "2", "lun/id:1/status": "Offline"}, "Offline", "is not mounted", CONNECT),
    ({"lun/id:1/volume_state": "2", "lun/id:1/status": "Offline", "lun/id:1/dev": ""}, "Offline",
     "its LUN has no disk here", CONNECT),
    ({"lun/id:1/volume_state": "3", "lun/id:1/status": "Create Volume Failed"}, "Create Volume Failed",
     "its partition, format or mount failed", CONNECT),
    # Given up at start-up and connected since: what it lacks now counts.
    ({"lun/id:1/volume_state": "4", "lun/id:1/status": "Offline", "lun/id:1/dev": ""}, "Offline",
     "its LUN has no disk here", CONNECT),
    ({"lun/id:1/volume_state": "4", "lun/id:1/status": "Offline"}, "Offline", "is not mounted", CONNECT),
    ({"lun/id:1/volume_state": "5", "lun/id:1/status": "Unsupported File System"}, "Unsupported File System",
     "what is on its disk cannot be mounted here", FORMAT),
    ({"lun/id:1/format_state": "3", "lun/id:1/status": "Create Volume Failed"}, "Create Volume Failed",
     "its format failed", FORMAT),
    ({"lun/id:1/status": ""}, "Not Mounted", "is not mounted", CONNECT),
]


def change(box, values):
    box.tree.set({f"{T1}/{key}": value for key, value in values.items()})


def check_problem(box, status, problem, command):
    told = volumes(box)[0]
    assert (told["status"], told["problem"], told["command"]) == (status, problem, command)
    assert told["healthy"] is False and told["wanted"] is True
    done = vvstat(box)
    assert done.status == 1
    text = " ".join(done.stdout.split())
    assert f"Backup: {problem}; {told['advice']}" in text
    assert command is None or f"    {command}\n" in done.stdout


@pytest.mark.parametrize("values, status, problem, command", TREE_PROBLEMS)
def test_a_problem_that_the_tree_knows(example, values, status, problem, command):
    change(example, values)
    check_problem(example, status, problem, command)


@pytest.mark.parametrize("values, status, problem, command", UNMOUNTED_PROBLEMS)
def test_a_volume_that_is_not_mounted(example, values, status, problem, command):
    run(example, "/bin/umount", "/mnt/VV/Backup")
    change(example, values)
    check_problem(example, status, problem, command)
    assert volumes(example)[0]["size"] is None


@pytest.mark.parametrize("values", [{"format_state": "3"}, {"volume_state": "5"}])
def test_what_formats_says_that_it_destroys(example, values):
    """The command that stands below is made to be copied."""
    run(example, "/bin/umount", "/mnt/VV/Backup")
    change(example, {f"lun/id:1/{key}": value for key, value in values.items()})
    told = volumes(example)[0]
    assert told["command"] == FORMAT and "; a new format destroys " in told["advice"]


@contextlib.contextmanager
def a_run_works(box, target, lun=None):
    """What a run of the tool does while it works on a target, or on one LUN of it."""
    digest = 14695981039346656037
    for byte in target.encode():
        digest = (digest ^ byte) * 1099511628211 % 2 ** 64
    folder = box.path("/run/remvol")
    folder.mkdir(mode=0o700, parents=True, exist_ok=True)
    with contextlib.ExitStack() as held:
        def hold(kind, how):
            lock = held.enter_context(open(folder / f"{kind}-{digest:016x}.lock", "w", encoding="ascii"))
            fcntl.flock(lock, how)

        hold("target", fcntl.LOCK_EX if lun is None else fcntl.LOCK_SH)
        if lun is not None:
            hold(f"lun-{lun}", fcntl.LOCK_EX)
        yield


@pytest.mark.parametrize("lun", [None, 0])
def test_a_volume_that_is_not_mounted_while_a_command_works_on_it(example, lun):
    run(example, "/bin/umount", "/mnt/VV/Backup")
    with a_run_works(example, T1_NAME, lun):
        check_problem(example, "Busy", "is not mounted while a command works on its target", None)
    check_problem(example, "Not Mounted", "is not mounted", CONNECT)


def test_a_command_that_works_on_another_volume_of_the_target_mounts_this_one_not(example):
    run(example, "/bin/umount", "/mnt/VV/Backup")
    with a_run_works(example, T1_NAME, lun=1):
        check_problem(example, "Not Mounted", "is not mounted", CONNECT)


@pytest.mark.parametrize("lun", [None, 0])
def test_a_volume_whose_disk_is_yet_to_be_found_while_a_command_works_on_it(example, lun):
    """A command says that the target is connected before it has looked for the disks."""
    run(example, "/bin/umount", "/mnt/VV/Backup")
    change(example, {"lun/id:1/dev": ""})
    with a_run_works(example, T1_NAME, lun):
        check_problem(example, "Busy", "is not mounted while a command works on its target", None)
    check_problem(example, "No Disk", "its LUN has no disk here", CONNECT)


def test_a_session_that_is_gone_is_lost_whoever_works_on_its_target(example):
    example.path("/sys/class/iscsi_session/session3").rename(example.path("/sys/class/gone"))
    with a_run_works(example, T1_NAME):
        assert volumes(example)[0]["status"] == "No Session"


@pytest.mark.parametrize("state, status, problem, command", [
    (None, "No Session", "the target's session is gone, although nobody disconnected it", CONNECT),
    ("FAILED", "Reconnecting", "the connection was lost", None),
    ("FREE", "Reconnecting", "the connection was lost", None)])
def test_a_session_that_is_not_what_the_tree_says(example, state, status, problem, command):
    if state is None:
        example.path("/sys/class/iscsi_session/session3").rename(example.path("/sys/class/gone"))
    else:
        session(example, 3, T1_NAME, state)
    check_problem(example, status, problem, command)
    told = volumes(example)[0]
    assert told["session"] == state and told["otherwise"] == 'the configuration tree says "Running"'


def test_of_two_sessions_the_one_that_is_logged_in_counts(example):
    session(example, 1, T1_NAME, "FAILED")
    session(example, 9, T1_NAME, "FREE")
    assert vvstat(example).status == 0


@pytest.mark.parametrize("right, disk, healthy", [("1", "0", False), ("0", "0", False), ("1", "1", False),
                                                  ("0", "1", True), ("1", None, False)])
def test_a_volume_that_became_read_only(example, right, disk, healthy):
    run(example, "/bin/mount", "-o", "remount,ro", "/mnt/VV/Backup")
    assert volumes(example)[0]["options"].startswith("ro,")
    change(example, {"lun/id:1/vol_access_right": right})
    if disk is not None:
        example.write("/sys/class/block/sdb/ro", disk + "\n")
    told = volumes(example)[0]
    assert told["ro"] is True and told["healthy"] is healthy
    assert vvstat(example).status == (0 if healthy else 1)
    if not healthy:
        check_problem(example, "Read Only", BECAME_READ_ONLY, MOUNT_ANEW)


def test_a_volume_that_the_tree_takes_for_read_only_is_what_its_mount_is(example):
    change(example, {"lun/id:1/vol_access_right": "0", "lun/id:1/status": "Running ( Read Only )"})
    told = volumes(example)[0]
    assert (told["status"], told["ro"], told["tree-status"]) == ("Running", False, "Running ( Read Only )")
    run(example, "/bin/mount", "-o", "remount,ro", "/mnt/VV/Backup")
    example.write("/sys/class/block/sdb/ro", "1\n")
    assert volumes(example)[0]["status"] == "Running ( Read Only )" and vvstat(example).status == 0


@pytest.fixture
def on_a_disk(example):
    """The first volume is an ext4 on a real disk; the kernel's name of that."""
    run(example, "/bin/umount", "/mnt/VV/Backup")
    example.disk("sdb", 64 << 20)
    run(example, "/sbin/mke2fs", "-q", "-t", "ext4", "/dev/sdb")
    run(example, "/bin/mount", "-o", "errors=remount-ro", "/dev/sdb", "/mnt/VV/Backup")
    number = example.run(["stat", "-c", "%Hr:%Lr", "/dev/sdb"]).stdout.strip()
    yield os.path.basename(os.readlink(f"/sys/dev/block/{number}"))
    run(example, "/bin/umount", "/mnt/VV/Backup")


def test_a_file_system_that_refuses_writes_though_its_mount_does_not_say_so(example, on_a_disk):
    assert vvstat(example).status == 0
    pathlib.Path(f"/sys/fs/ext4/{on_a_disk}/trigger_fs_error").write_text("an error\n")
    assert "ro" not in example.run(["findmnt", "-no", "OPTIONS", "/mnt/VV/Backup"]).stdout.strip().split(",")
    check_problem(example, "Read Only", BECAME_READ_ONLY, MOUNT_ANEW)
    assert volumes(example)[0]["ro"] is True


def test_a_file_system_that_has_shut_itself_down(example):
    """An XFS fails every question then, also whether something is mounted there."""
    run(example, "/bin/umount", "/mnt/VV/Backup")
    example.disk("sdb", 400 << 20)
    run(example, "/sbin/mkfs.xfs", "-q", "/dev/sdb")
    run(example, "/bin/mount", "/dev/sdb", "/mnt/VV/Backup")
    try:
        assert vvstat(example).status == 0
        run(example, "/usr/sbin/xfs_io", "-x", "-c", "shutdown", "/mnt/VV/Backup")
        check_problem(example, "Shut Down", "its file system has shut itself down after an error", MOUNT_ANEW)
        told = volumes(example)[0]
        assert told["mounted"] is True and told["ro"] is True and told["size"] > 300 << 20
    finally:
        run(example, "/bin/umount", "/mnt/VV/Backup")


def test_what_is_said_of_a_lost_connection_asks_no_disk(example, on_a_disk):
    pathlib.Path(f"/sys/fs/ext4/{on_a_disk}/trigger_fs_error").write_text("an error\n")
    session(example, 3, T1_NAME, "FAILED")
    example.leaks_unchecked()  # strace and the leak checker do not go together
    traced = example.run(["strace", "-f", "-e", "trace=openat", "vvstat"], env={"LD_PRELOAD": None}).stderr
    assert "O_TMPFILE" not in traced


def opened(box, *options):
    """The files that are asked for."""
    box.leaks_unchecked()  # strace and the leak checker do not go together
    said = box.run(["strace", "-f", "-e", "trace=openat", "vvstat", *options], env={"LD_PRELOAD": None}).stderr
    return re.findall(r'openat\([^"]*"([^"]*)"', said)


MOUNT_TABLE, IS_DISK_READ_ONLY = "/proc/self/mountinfo", "/sys/class/block/sdb/ro"
ADDRESS = "/sys/class/iscsi_connection/connection3:0/persistent_address"


@pytest.mark.parametrize("options, everything", [([], False), (["-P"], False), (["-o", "SHARE,PROBLEM"], False), (["-rn"], False),
                                                 (["-o", "+OPTIONS"], True), (["-o", "ADDRESS"], True), (["-J"], True),
                                                 (["Backup"], True), (["-o", "STATUS", "Backup"], False)])
def test_only_what_is_shown_is_asked_of_the_kernel(example, options, everything):
    paths = opened(example, *options)
    assert (MOUNT_TABLE in paths, ADDRESS in paths) == (everything, everything)
    assert IS_DISK_READ_ONLY not in paths  # of what can be written


@pytest.mark.parametrize("place, mounted", [("/mnt/link/Backup", True), ("/mnt/VV/Backup/", True), ("/mnt/VV/../VV/Backup", True),
                                            ("/", True), ("Backup", False), ("/Backup", False), ("/mnt/none/Backup", False),
                                            ("/mnt/VV/Backup/file", False), ("/mnt/VV/Backup/file/x", False)])
def test_a_mount_point_wherever_it_is(example, place, mounted):
    """The second volume's is in the usual folder."""
    example.run(["ln", "-s", "/mnt/VV", "/mnt/link"])
    change(example, {"lun/id:1/mnt": place})
    assert [volume["mounted"] for volume in volumes(example)[:2]] == [mounted, True]


def test_a_locale_is_read_only_where_a_name_needs_one(example):
    assert any("locale" in path for path in opened(example))
    change(example, {"lun/id:2/share": "Photos", "lun/id:2/mnt": "/mnt/VV/Photos"})
    assert not any("locale" in path for path in opened(example))


def test_a_disk_that_is_gone_below_a_mount(example, on_a_disk):
    run(example, "/bin/mount", "-t", "tmpfs", "disks", "/sys/dev/block")
    check_problem(example, "No Disk", "its disk is gone, though its target is connected", MOUNT_ANEW)


def test_a_file_system_with_errors_that_takes_writes_is_well(example, on_a_disk):
    run(example, "/bin/mount", "-o", "remount,errors=continue", "/mnt/VV/Backup")
    pathlib.Path(f"/sys/fs/ext4/{on_a_disk}/trigger_fs_error").write_text("an error\n")
    assert vvstat(example).status == 0


def test_a_volume_that_the_tree_takes_for_lost_is_well_when_it_is(example):
    """The texts of the tree are as old as the last command."""
    change(example, {"lun/id:1/volume_state": "2", "lun/id:1/status": "Offline"})
    assert vvstat(example).status == 0
    told = volumes(example)[0]
    assert (told["status"], told["tree-status"]) == ("Running", "Offline")
    assert told["otherwise"] == 'the configuration tree says "Offline"'
    assert 'OTHERWISE    the configuration tree says "Offline"\n' in vvstat(example, "Backup").stdout


@pytest.mark.parametrize("values", [{"conn_set": "0", "conn_state": "0"}, {"conn_set": "0", "conn_state": "3"},
                                    {"conn_set": "0", "conn_state": "0", "lun/id:1/volume_state": "3"},
                                    {"conn_set": "0", "conn_state": "0", "lun/id:1/volume_state": "4", "lun/id:1/enable": "0"},
                                    {"lun/id:1/enable": "0", "lun/id:2/enable": "0", "lun/id:1/volume_state": "3"}])
def test_what_is_not_wanted_needs_no_attention(example, values):
    run(example, "/bin/umount", "/mnt/VV/Backup")
    change(example, values)
    done = vvstat(example)
    assert done.status == 0 and "nothing is wanted, as of" in done.stdout


def test_a_target_without_volumes_is_seen(example):
    example.tree.set({f"{T2}/conn_set": "1", f"{T2}/conn_state": "4"})
    done = vvstat(example)
    assert done.status == 1
    assert "1 of 3 needs attention, as of" in done.stdout
    assert "  iqn.t2: the login failed; " in done.stdout
    told = volumes(example)[2]
    assert (told["share"], told["lun"], told["status"]) == (None, None, "Connect Error")


def test_only_what_needs_attention(example):
    done = vvstat(example, "-x")
    assert (done.status, without_clock(done.stdout)) == (0, "all 2 healthy, 1 not wanted, as of CLOCK\n")
    assert volumes(example, "-x") == []
    change(example, {"lun/id:2/format_state": "4"})
    done = vvstat(example, "--unhealthy")
    assert done.status == 1
    assert done.lines[1].startswith("Fotos 日本 ") and done.lines[2] == ""
    assert done.lines[3].startswith("1 of 2 needs attention")
    assert [volume["share"] for volume in volumes(example, "-x")] == ["Fotos 日本"]


@pytest.mark.parametrize("name, word", [("iqn.x;reboot", "'iqn.x;reboot'"), ("iqn.$(id)", "'iqn.$(id)'"),
                                        ("iqn.'q'", "'iqn.'\\''q'\\'" + "''"), ("iqn.2-a:b_c", "iqn.2-a:b_c")])
def test_a_command_can_be_copied_whatever_the_name_is(example, name, word):
    change(example, {"conn_state": "0", "lun/id:1/share": name})
    assert f"    vv connect {word}\n" in vvstat(example).stdout
    example.tree.set({f"{T2}/target": name, f"{T2}/conn_set": "1"})
    assert f"    remvol --connect -n {word}\n" in vvstat(example).stdout


def test_the_command_of_a_name_that_looks_like_an_option(example):
    change(example, {"conn_state": "0", "lun/id:1/share": "--json"})
    assert "    vv connect -- --json\n" in vvstat(example).stdout


def commands_in(text):
    """The words of the commands of a verdict, as a shell takes them."""
    lines = "".join(re.findall(r"^ *(?:vv|remvol) .*\n(?:(?<=\\\n).*\n)*", text, re.M))
    shell = 'say() { printf "<%s>" "$@"; echo; }; vv() { say vv "$@"; }; remvol() { say remvol "$@"; }\n'
    return subprocess.run(["bash", "-c", shell + lines], stdout=subprocess.PIPE, text=True, check=True).stdout


@pytest.mark.parametrize("columns", [12, 20, 40, 80])
@pytest.mark.parametrize("name", ["Backup", "s" * 100, "two words and 'marks'" * 5, "Grüße aus Köln 日本" * 6, "'" * 30])
def test_a_command_that_is_folded_is_still_one(example, columns, name):
    change(example, {"conn_state": "0", "lun/id:1/share": name, "lun/id:2/enable": "0"})
    example.tree.set({f"{T2}/target": LONG_NAME, f"{T2}/conn_set": "1"})
    text = vvstat(example, env={"COLUMNS": str(columns)}).stdout
    assert commands_in(text) == f"<vv><connect><{name}>\n<remvol><--connect><-n><{LONG_NAME}>\n"
    assert max(width(line) for line in text.splitlines()) <= columns


# --- since when ---

KEY = f"{T1_NAME} 0 Backup"
LOST_AT = datetime.datetime(2026, 11, 21, 12, 34, 56, tzinfo=datetime.timezone.utc)


def remember(box, *lines):
    box.write("/run/remvol/history", "".join(line + "\n" for line in lines))


def test_since_when_something_is_wrong(example):
    session(example, 3, T1_NAME, "FAILED")
    remember(example, f"2 {int(LOST_AT.timestamp())} 2 0 0 {KEY}\t{int(LOST_AT.timestamp())} the connection was lost")
    done = vvstat(example, env={"TZ": "UTC"})
    text = " ".join(done.stdout.split())
    assert f"Backup: the connection was lost (since 2026-11-21 12:34); {HEALS}" in text
    assert f"Fotos 日本: the connection was lost; {HEALS}" in text
    told = volumes(example)[0]
    assert datetime.datetime.fromisoformat(told["since"]) == datetime.datetime.fromisoformat(told["error-time"]) == LOST_AT
    assert told["last-error"] == "the connection was lost"
    block = dict(line.split(None, 1) for line in vvstat(example, "Backup", env={"TZ": "Etc/GMT-2"}).lines)
    assert block["SINCE"] == block["ERROR-TIME"] == "2026-11-21 14:34:56"
    assert block["LAST-ERROR"] == "the connection was lost"


def test_of_today_the_clock_is_said(example):
    change(example, {"conn_state": "4"})
    now = int(time.time())
    remember(example, f"4 {now} 4 0 0 {KEY}")
    clock = time.strftime("%H:%M:%S", time.gmtime(now))
    assert f"Backup: the login failed (since {clock}); " in " ".join(vvstat(example, env={"TZ": "UTC"}).stdout.split())


def test_a_change_that_the_notifier_has_not_seen_has_no_time(example):
    change(example, {"conn_state": "4"})
    remember(example, f"0 1000000 0 0 0 {KEY}\t1000000 is not mounted")
    told = volumes(example)[0]
    assert told["since"] is None and told["last-error"] == "is not mounted"
    assert "since" not in vvstat(example).stdout
    assert ("Backup", "0", T1_NAME) not in metrics(example).get("remvol_volume_seconds_since_change", {})


def test_how_long_it_has_been_so_is_a_metric(example):
    remember(example, f"0 {int(time.time()) - 100} 0 0 0 {KEY}")
    seconds = metrics(example)["remvol_volume_seconds_since_change"]
    assert 100 <= seconds.pop(("Backup", "0", T1_NAME)) < 130 and seconds == {}


def test_a_clock_that_was_set_back(example):
    remember(example, f"0 {int(time.time()) + 1000} 0 0 0 {KEY}")
    assert metrics(example)["remvol_volume_seconds_since_change"] == {("Backup", "0", T1_NAME): 0}


def test_the_notifier_s_memory_is_what_is_shown(example):
    change(example, {"conn_state": "4"})
    before = int(time.time())
    assert example.run(["remvol-notify"], env={"LD_PRELOAD": None}).status == 0
    told = volumes(example)[0]
    assert before <= datetime.datetime.fromisoformat(told["since"]).timestamp() <= time.time()
    assert told["last-error"] == "the login failed"


@pytest.mark.parametrize("make", [lambda path: path.write_bytes(bytes(range(256)) * 10), lambda path: path.mkdir(),
                                  lambda path: os.mkfifo(path), lambda path: path.symlink_to("/etc/passwd")])
def test_a_memory_that_is_none(example, make):
    example.path("/run/remvol").mkdir(exist_ok=True)
    make(example.path("/run/remvol/history"))
    done = vvstat(example)
    assert (done.status, without_clock(done.stdout), done.stderr) == (0, TABLE, "")


# --- columns and forms ---


def test_json(example):
    told = volumes(example)
    options = told[0].pop("options").split(",")
    assert options[0] == "rw" and options.count("relatime") == 1 and "size=20480k" in options
    assert told[0] == {
        "share": "Backup", "status": "Running", "used": 3 << 19, "size": 20 << 20, "use%": 8, "lun": 0,
        "portal": "10.9.0.2:3260", "target": T1_NAME, "healthy": True, "wanted": True, "problem": None, "advice": None,
        "command": None, "since": None, "last-error": None, "error-time": None, "mounted": True, "ro": False, "mountpoint": "/mnt/VV/Backup", "device": "sdb", "fstype": "ext4",
        "progress": None, "session": "LOGGED_IN", "address": "10.9.0.2", "tree-status": "Running",
        "tree-target": "Connected", "otherwise": None}
    assert told[1]["share"] == "Fotos 日本"
    assert told[2]["wanted"] is False and told[2]["healthy"] is True
    change(example, {"lun/id:2/format_state": "1", "lun/id:2/format_progress": "37"})
    assert volumes(example)[1]["progress"] == 37


def metrics(box):
    """The metrics as a monitor reads them: name -> {labels: value}."""
    done = vvstat(box, "--prometheus")
    families = list(prometheus_client.parser.text_string_to_metric_families(done.stdout))
    assert all(family.documentation and family.type == "gauge" for family in families)
    assert done.stdout.count("# TYPE") == len({family.name for family in families}) == len(families)
    return {family.name: {tuple(sample.labels.values()): sample.value for sample in family.samples} for family in families}


def test_metrics(example):
    backup, photos = ("Backup", "0", T1_NAME), ("Fotos 日本", "1", T1_NAME)
    change(example, {"lun/id:2/format_state": "1", "lun/id:2/format_progress": "37"})
    run(example, "/bin/umount", "/mnt/VV/Fotos 日本")
    assert metrics(example) == {
        "remvol_tree_reachable": {(): 1},
        "remvol_target_wanted": {(T1_NAME,): 1, ("iqn.t2",): 0},
        "remvol_target_connected": {(T1_NAME,): 1, ("iqn.t2",): 0},
        "remvol_volume_wanted": {backup: 1, photos: 1},
        "remvol_volume_healthy": {backup: 1, photos: 0},
        "remvol_volume_mounted": {backup: 1, photos: 0},
        "remvol_volume_read_only": {backup: 0, photos: 0},
        "remvol_volume_used_bytes": {backup: 3 << 19},
        "remvol_volume_size_bytes": {backup: 20 << 20},
        "remvol_volume_format_progress_percent": {photos: 37},
    }
    session(example, 3, T1_NAME, "FAILED")
    assert metrics(example)["remvol_target_connected"] == {(T1_NAME,): 0, ("iqn.t2",): 0}
    assert vvstat(example, "-P").status == 1


PROMTOOL = pathlib.Path(__file__).resolve().parents[2] / "build/tools/promtool"


def promtool(*words, **more):
    if not PROMTOOL.exists():
        pytest.skip("scripts/get-promtool has not been run")
    return subprocess.run([PROMTOOL, *words], stdout=subprocess.PIPE, stderr=subprocess.STDOUT, text=True, **more)


@pytest.mark.parametrize("name", ["Photos", 'quo"te', "back\\slash", "new\nline", "bad\udcff", "a\u202eb"])
def test_promtool_accepts_the_metrics(example, name):
    change(example, {"lun/id:1/share": name, "lun/id:2/format_state": "1", "lun/id:2/format_progress": "37"})
    assert example.run(["remvol-notify"], env={"LD_PRELOAD": None}).status == 0
    text = vvstat(example, "-P").stdout
    assert text.count("# HELP") == text.count("# TYPE") == 11
    done = promtool("check", "metrics", input=text)
    assert (done.returncode, done.stdout) == (0, "")


def test_promtool_finds_what_is_wrong():
    assert promtool("check", "metrics", input="remvol_volume_healthy{share=\"a\nb\"} 1\n").returncode != 0


def test_promtool_accepts_the_metrics_without_the_tree(box):
    box.tree.stop()
    done = promtool("check", "metrics", input=vvstat(box, "-P").stdout)
    assert (done.returncode, done.stdout) == (0, "")


def test_metrics_without_the_tree_say_so(box):
    box.tree.stop()
    assert metrics(box) == {"remvol_tree_reachable": {(): 0}}
    done = vvstat(box, "-P")
    assert (done.status, done.stderr) == (3, "")  # a collector asks every minute, and has it in the metrics


def test_metrics_without_root_say_that_root_is_needed(example):
    done = example.run(["/usr/bin/setpriv", "--reuid=65534", "--regid=65534", "--clear-groups", "vvstat", "-P"],
                       env={"LD_PRELOAD": None})
    assert (done.status, done.stderr) == (3, "vvstat: only root may read the configuration tree\n")
    assert done.stdout.endswith("\nremvol_tree_reachable 0\n")


@pytest.mark.parametrize("name", ['a"b', "a\\b", "a\nb", "a\udcffb", "{x=}"])
def test_metrics_of_a_name_with_marks(example, name):
    change(example, {"lun/id:1/share": name})
    shown = name.replace("\n", "\\x0A").replace("\udcff", "\\xFF")
    assert (shown, "0", T1_NAME) in metrics(example)["remvol_volume_healthy"]


def test_every_column_is_in_the_schema_and_the_help(example):
    names = set(re.findall(r"^  ([A-Z%-]+) ", vvstat(example, "--help").stdout, re.M))
    assert {name.lower() for name in names} == set(SCHEMA["properties"]["volumes"]["items"]["properties"])
    assert {name.lower() for name in names} == set(volumes(example)[0])


def test_chosen_columns(example):
    assert vvstat(example, "-no", "lun,SHARE").lines[0].split() == ["0", "Backup"]
    assert vvstat(example, "-o", "+device").lines[0].split() == [
        "SHARE", "STATUS", "USED", "SIZE", "USE%", "LUN", "PORTAL", "DEVICE"]
    assert vvstat(example, "-o", "share,share").lines[0] == "SHARE"
    assert volumes(example, "-o", "share,use%") == [
        {"share": "Backup", "use%": 8}, {"share": "Fotos 日本", "use%": 0}, {"share": None, "use%": None}]


@pytest.mark.parametrize("names, unknown", [("size,colour", "colour"), ("", ""), ("share,", ""), ("+", ""), ("shar", "shar"),
                                            ("\x1b[2J", "\\x1B[2J")])
def test_a_column_that_does_not_exist(example, names, unknown):
    done = vvstat(example, "-o", names)
    assert (done.status, done.stdout) == (2, "")
    assert done.stderr.startswith(f'vvstat: there is no column "{unknown}"\n')


def test_raw_rows_are_for_programs(example):
    assert vvstat(example, "-rno", "LUN,SHARE,STATUS").stdout == (
        "0 Backup Running\n1 Fotos\\x20" + "".join(f"\\x{b:02x}" for b in "日本".encode()) + " Running\n"
        "  Disconnected\n")


def test_without_headings_there_are_the_rows_alone(example):
    """libsmartcols 2.41 makes room for a heading only where there is one, 2.38 always."""
    rows = [line.split() for line in TABLE.splitlines()[1:4]]
    assert [line.split() for line in vvstat(example, "-n").lines] == rows


def test_sizes_in_bytes(example):
    assert vvstat(example, "-bno", "USED,SIZE").lines[0].split() == [str(3 << 19), str(20 << 20)]


def test_everything_of_one_share(example):
    done = vvstat(example, "Backup")
    assert done.status == 0
    told = dict(line.split(None, 1) for line in done.lines)
    assert told["STATUS"] == "Running" and told["TARGET"] == T1_NAME and told["MOUNTPOINT"] == "/mnt/VV/Backup"
    assert told["SESSION"] == "LOGGED_IN" and told["SIZE"] == "20M" and "PROBLEM" not in told
    change(example, {"conn_state": "0"})
    done = vvstat(example, "Backup")
    told = dict(line.split(None, 1) for line in done.lines)
    assert done.status == 1 and told["PROBLEM"] == "is not connected" and told["COMMAND"] == CONNECT


def test_of_one_share_what_was_asked_for(example):
    assert vvstat(example, "-o", "STATUS,LUN", "Backup").stdout == "STATUS       Running\nLUN          0\n"
    assert vvstat(example, "-no", "STATUS,PROBLEM,LUN", "Backup").stdout == "Running\n\n0\n"
    assert vvstat(example, "-no", "SHARE", T1_NAME).stdout == "Backup\nFotos 日本\n"
    assert vvstat(example, "-rno", "STATUS", "Backup").stdout == "Running\n"


def test_of_one_share_only_what_needs_attention(example):
    assert (vvstat(example, "-x", "Backup").status, vvstat(example, "-x", "Backup").stdout) == (0, "")
    change(example, {"lun/id:2/format_state": "4"})
    done = vvstat(example, "-x", T1_NAME)
    assert done.status == 1 and re.findall("^SHARE .*", done.stdout, re.M) == ["SHARE        Fotos 日本"]
    assert [volume["share"] for volume in volumes(example, "-x", T1_NAME)] == ["Fotos 日本"]


@pytest.mark.parametrize("columns", [80, 40, 20, 14])
def test_of_one_share_too_no_line_is_wider_than_the_screen(example, columns):
    example.tree.set({**LONG_VALUES, f"{T1}/conn_state": "4"})
    text = vvstat(example, LONG_NAME, env={"COLUMNS": str(columns)}).stdout
    assert max(width(line) for line in text.splitlines()) <= columns
    assert LONG_NAME in re.sub(r"\n *", "", text)


def test_everything_of_one_target(example):
    done = vvstat(example, T1_NAME)
    assert [block.split("\n")[0].split(None, 1)[1] for block in done.stdout.split("\n\n")] == ["Backup", "Fotos 日本"]
    assert [volume["share"] for volume in volumes(example, T1_NAME)] == ["Backup", "Fotos 日本"]


def test_one_share_counts_alone(example):
    change(example, {"lun/id:2/format_state": "4"})
    assert vvstat(example, "Backup").status == 0
    assert vvstat(example, "Fotos 日本").status == 1


def test_a_name_that_is_not_there(example):
    for options in ([], ["--json"]):
        done = vvstat(example, *options, "No\x1bwhere")
        assert (done.status, done.stdout) == (2, "")
        assert done.stderr == ('vvstat: there is no share or target "No\\x1Bwhere"; '
                               f"there are: Backup, Fotos 日本, {T1_NAME}, iqn.t2\n")


def test_a_name_where_none_is(box):
    assert vvstat(box, "Nowhere").stderr == 'vvstat: there is no share or target "Nowhere"; none is configured\n'


LONG_VALUES = {f"{T1}/target": LONG_NAME, f"{T1}/lun/id:1/share": "s" * 80, f"{T1}/ip": "[fe80::1234:5678:9abc:def0]",
               f"{T1}/lun/id:1/status": "Unsupported File System ( Read Only )"}
USUAL = ["SHARE", "STATUS", "USED", "SIZE", "USE%", "LUN", "PORTAL"]


@pytest.mark.parametrize("options", [[], ["-n"], ["-o", "+TARGET,ADVICE,COMMAND"], ["-o", "TARGET,COMMAND,SHARE"], ["-x"]])
@pytest.mark.parametrize("columns", [200, 80, 60, 40, 30, 20, 12, None])
def test_no_line_is_wider_than_the_screen(example, columns, options):
    example.tree.set({**LONG_VALUES, f"{T1}/conn_state": "4"})
    done = vvstat(example, *options, env={"COLUMNS": str(columns) if columns else None})
    assert done.status == 1
    assert max(width(line) for line in done.lines) <= (columns or 80)
    assert done.stdout.count("the login failed") == 2 or "-n" in options or (columns or 80) < 40


@pytest.mark.parametrize("columns, shown", [(80, 7), (60, 7), (54, 6), (46, 6), (45, 5), (42, 5), (41, 4), (37, 4), (36, 3),
                                            (32, 3), (31, 2), (27, 2), (26, 1), (12, 1), (5, 1), (1, 1)])
def test_what_matters_least_is_left_out_first(example, columns, shown):
    example.tree.set(LONG_VALUES)
    heading, row = vvstat(example, env={"COLUMNS": str(columns)}).lines[:2]
    assert heading.split() == ([*USUAL][:shown] if columns >= 5 else ["S"])
    assert row.split()[0] == ("s" * 80)[:len(row.split()[0]) - 1] + "~" and max(width(heading), width(row)) <= columns


def test_a_text_that_is_cut_says_so(example):
    example.tree.set(LONG_VALUES)
    row = vvstat(example, env={"COLUMNS": "80"}).lines[1]
    assert re.fullmatch(r"s{11,}~ No Session +1\.5M  20M    8   0 \[fe80::1234:~", row), row
    row = vvstat(example, env={"COLUMNS": "150"}).lines[1]
    assert "~" not in row and row.endswith(" [fe80::1234:5678:9abc:def0]:3260")


def test_what_was_asked_for_beside_the_usual_is_kept_for_them(example):
    """What was asked for matters more than what is always there, but for the share and its status."""
    change(example, {"target": LONG_NAME})
    heading, row = vvstat(example, "-o", "+TARGET", env={"COLUMNS": "110"}).lines[:2]
    assert heading.split() == [*USUAL[:5], "TARGET"] and row.endswith(" " + LONG_NAME)
    heading, row = vvstat(example, "-o", "+TARGET", env={"COLUMNS": "80"}).lines[:2]
    assert heading.split() == [*USUAL[:6], "TARGET"] and row.endswith("~") and width(row) == 80


def test_the_target_is_shown_where_there_is_room(example):
    change(example, {"target": LONG_NAME})
    lines = vvstat(example, env={"COLUMNS": "140"}).lines
    assert lines[0].endswith(" TARGET") and lines[1].endswith(" " + LONG_NAME)
    assert not vvstat(example, env={"COLUMNS": "100"}).lines[0].endswith(" TARGET")


def test_the_target_takes_the_room_of_nothing_else(example):
    seen = set()
    for columns in range(70, 131):
        lines = vvstat(example, env={"COLUMNS": str(columns)}).lines
        shown = lines[0].endswith(" TARGET")
        seen.add(shown)
        assert lines[1].split()[6:] == ["10.9.0.2:3260", *([T1_NAME] if shown else [])], columns
    assert seen == {False, True}


def test_sentences_are_folded_to_the_screen(example):
    change(example, {"conn_state": "0"})
    lines = vvstat(example, env={"COLUMNS": "40"}).stdout.split("\n\n")[1].splitlines()
    assert all(width(line) <= 40 for line in lines) and f"    {CONNECT}" in lines


def test_secrets_are_not_shown(example):
    for options in ([], ["-J"], ["-r"], ["-P"], ["Backup"]):
        assert "canary" not in vvstat(example, *options).stdout


@pytest.mark.parametrize("name, shown", [
    ('quo"te', 'quo"te'), ("back\\slash", "back\\slash"), ("new\nline", "new\\x0Aline"), ("\x1b[31mred", "\\x1B[31mred"),
    ("tab\t", "tab\\x09"), ("bad\udcff", "bad\\xFF"), ("\x7f", "\\x7F"), ("é", "é"), ("\u0085", "\\xC2\\x85"),
    ("\u2028", "\\xE2\\x80\\xA8"), ("a\u202eb", "a\\xE2\\x80\\xAEb"), ("😀", "😀"), ("\\x41", "\\x41")])
def test_names_of_users_break_no_form(example, name, shown):
    example.tree.set(f"{T1}/lun/id:1/share", name)
    table = vvstat(example).stdout
    assert table.count("\n") == 6 and table.splitlines()[1].startswith(shown + " ")
    assert volumes(example)[0]["share"] == shown
    assert f"SHARE        {shown}\n" in vvstat(example, T1_NAME).stdout


def test_eight_targets_with_eight_volumes(box):
    for target in range(1, 9):
        store(box, f"iqn.{target}", slot=target, luns=[(f"s{target}{lun}", lun) for lun in range(1, 9)])
    assert len(vvstat(box, "-n").lines) == 64


@pytest.mark.parametrize("options, status", [(["--help"], 0), (["-h"], 0), (["--version"], 0), (["-V"], 0),
                                             (["--nonsense"], 2), (["one", "more"], 2), (["-w", "Backup"], 2), (["-P", "Backup"], 2), (["-Pw"], 2), (["-o"], 2),
                                             (["-PJ"], 2), (["-Pr"], 2), (["-Px"], 2), (["-Pb"], 2), (["-Pn"], 2), (["-P", "-o", "SHARE"], 2)])
def test_the_usual_options(bare_box, options, status):
    done = vvstat(bare_box, *options)
    assert done.status == status
    told, silent = (done.stdout, done.stderr) if status == 0 else (done.stderr, done.stdout)
    assert told and not silent


@pytest.mark.parametrize("options, said", [
    (["-w", "Backup"], "--watch shows all volumes: it goes with no name"),
    (["--watch", "--json", "Backup"], "--watch shows all volumes: it goes with no name"),
    (["-P", "-x"], "--prometheus goes with no other option and no name"),
    (["-P", "Backup"], "--prometheus goes with no other option and no name"),
    (["Backup", "Photos"], 'one name at a time: "Photos" is a second one'),
    (["-J", "a", "\x1b", "c"], 'one name at a time: "\\x1B" is a second one')])
def test_what_does_not_go_together_is_said(bare_box, options, said):
    done = vvstat(bare_box, *options)
    assert (done.status, done.stdout, done.stderr) == (2, "", f"vvstat: {said}\nTry 'vvstat --help'.\n")


def test_the_help_names_every_reason_of_a_status(bare_box):
    text = " ".join(vvstat(bare_box, "--help").stdout.split())
    assert "2 wrong usage, no such share or target, or the output cannot be written," in text


@pytest.mark.parametrize("options", [[], ["--json"], ["Backup"], ["--help"], ["--watch"]])
def test_what_cannot_be_written_is_a_failure(example, options):
    done = example.run(["sh", "-c", '"$@" >/dev/full', "sh", "vvstat", *options], env={"LD_PRELOAD": None})
    assert (done.status, done.stderr) == (2, "vvstat: write error: No space left on device\n")


# --- on a terminal ---


def on_a_terminal(box, *options, columns=200, lines=50, env=None, keys=False):
    return Terminal(box, ["vvstat", *options], columns=columns, lines=lines, keys=keys,
                    env={"LD_PRELOAD": None, **(env or {})})


def test_a_terminal_gets_colour(example):
    change(example, {"lun/id:2/format_state": "4", "lun/id:2/status": "Wait to Format"})
    terminal = on_a_terminal(example)
    assert terminal.end() == 1
    assert "\x1b[32mRunning" in terminal.text
    assert "\x1b[31mWait to Format" in terminal.text
    assert not re.search("\x1b[^ ]*Disconnected", terminal.text)


def test_no_color_is_respected(example):
    terminal = on_a_terminal(example, env={"NO_COLOR": "1"})
    assert terminal.end() == 0
    assert "\x1b" not in terminal.text


BEGIN, END = "\x1b[?1049h\x1b[?25l\x1b[?7l", "\x1b[?7h\x1b[?25h\x1b[?1049l"


def frames(terminal):
    """What was shown, one after the other, as lists of lines."""
    assert terminal.text.startswith(BEGIN) and terminal.text.endswith(END)
    drawn = terminal.text[len(BEGIN):-len(END)].split("\x1b[H")
    assert drawn.pop(0) == ""
    shown = []
    for frame in drawn:
        lines = re.split("\r+\n", frame)
        assert lines.pop() == "\x1b[J"
        assert all(line.endswith("\x1b[K") for line in lines)
        shown.append([line.removesuffix("\x1b[K") for line in lines])
    return shown


def test_watch_redraws_in_place(example):
    change(example, {"lun/id:2/format_state": "1", "lun/id:2/format_progress": "37", "lun/id:2/status": "Formatting 37%"})
    terminal = on_a_terminal(example, "--watch")
    terminal.wait_for("Formatting 37%")
    change(example, {"lun/id:2/format_progress": "38", "lun/id:2/status": "Formatting 38%"})
    terminal.wait_for("Formatting 38%")
    terminal.running.kill(signal.SIGINT)
    assert terminal.end() == 1
    shown = frames(terminal)
    assert len(shown) >= 2 and all(len(lines) == 7 for lines in shown)
    assert re.search(r"as of \d\d:\d\d:\d\d$", shown[0][5])


def test_watch_ends_with_q(example):
    terminal = on_a_terminal(example, "--watch", keys=True)
    terminal.wait_for("healthy")
    terminal.type("?")
    terminal.type("q")
    assert terminal.end() == 0
    assert terminal.text.endswith(END)


def test_watch_says_what_a_small_terminal_has_no_room_for(example):
    terminal = on_a_terminal(example, "--watch", columns=60, lines=5, env={"NO_COLOR": "1"})
    terminal.wait_for("\x1b[J")
    terminal.running.kill(signal.SIGTERM)
    assert terminal.end() == 0
    lines = frames(terminal)[0]
    assert lines[0].startswith("SHARE ") and lines[1].startswith("Backup ")
    assert lines[2] == "+2 rows"
    assert lines[3].startswith("all 2 healthy") and len(lines) == 4


@pytest.mark.parametrize("height", [1, 2, 3])
def test_watch_in_a_tiny_terminal_shows_the_verdict(example, height):
    terminal = on_a_terminal(example, "--watch", columns=20, lines=height, env={"NO_COLOR": "1"})
    terminal.wait_for("\x1b[J")
    terminal.running.kill(signal.SIGTERM)
    assert terminal.end() == 0
    lines = frames(terminal)[0]
    assert len(lines) <= max(1, height - 1) and "all 2 healthy" in "".join(lines)


def test_watch_goes_on_while_the_tree_is_away(example):
    terminal = on_a_terminal(example, "--watch")
    terminal.wait_for("healthy")
    example.tree.stop()
    terminal.wait_for("cannot be reached")
    example.tree.start()
    terminal.wait_for("no volumes are configured")
    example.tree.set({f"{T1}/target": "iqn.x", f"{T1}/conn_set": "1"})
    terminal.wait_for("iqn.x")
    terminal.running.kill(signal.SIGTERM)
    assert terminal.end() == 1


def test_watch_folds_what_it_says_of_the_tree(box):
    box.tree.stop()
    terminal = on_a_terminal(box, "--watch", columns=60, lines=5)
    terminal.wait_for("remvol-tree")
    terminal.running.kill(signal.SIGTERM)
    assert terminal.end() == 3
    text = "vvstat: the configuration tree cannot be reached; see systemctl status remvol-tree"
    lines = [line for line in frames(terminal)[0] if line]
    assert " ".join(lines) == text and max(map(width, lines)) <= 60


def test_watch_without_a_terminal_is_plain(example):
    running = example.start(["vvstat", "--watch"], env={"LD_PRELOAD": None})
    example.wait_until(lambda: running.stdout.count("SHARE ") >= 2, what="a second table")
    running.kill(signal.SIGTERM)
    done = running.wait()
    assert done.status == 0 and "\x1b" not in done.stdout


def test_watch_as_json_is_one_object_after_the_other(example):
    running = example.start(["vvstat", "--watch", "--json"], env={"LD_PRELOAD": None})
    example.wait_until(lambda: running.stdout.count("\n}\n") >= 2, what="a second object")
    running.kill(signal.SIGTERM)
    done = running.wait()
    assert done.status == 0
    for text in done.stdout.split("\n\n")[:-1]:
        jsonschema.validate(json.loads(text), SCHEMA)


@pytest.mark.parametrize("form", ["--json", "--raw", "--noheadings"])
def test_watch_for_programs_says_on_standard_error_that_the_tree_is_away(box, form):
    box.tree.stop()
    running = box.start(["vvstat", "--watch", form], env={"LD_PRELOAD": None})
    box.wait_until(lambda: running.stdout.count("\n") >= 2, what="a second look")
    running.kill(signal.SIGTERM)
    done = running.wait()
    assert (done.status, done.stdout.strip()) == (3, "")
    assert set(done.stderr.splitlines()) == {"vvstat: the configuration tree cannot be reached; see systemctl status remvol-tree"}


def test_watch_ends_when_nobody_reads(example):
    done = example.run(["sh", "-c", "vvstat --watch | head -n 1"], env={"LD_PRELOAD": None})
    assert done.status == 0
    example.wait_until(lambda: not any("vvstat" in argv[0] for argv in example.processes().values()),
                       what="the end of vvstat")


def test_a_system_without_the_utf8_locale(example):
    done = example.run(["rm", "-rf", "/usr/lib/locale"])
    assert done.status == 0
    done = vvstat(example)
    assert done.status == 0 and "\nFotos \\xE6\\x97\\xA5\\xE6\\x9C\\xAC Running " in done.stdout


# Not the table: libsmartcols 2.38 goes on for ever when it gets no memory while it chooses widths.
@pytest.mark.unsanitized
def test_whichever_allocation_fails(example):
    counter = example.path("/left")
    right = vvstat(example, "--json")

    def short_of_memory(left):
        counter.write_bytes(struct.pack("=q", left))
        done = vvstat(example, "--json", env={"LD_PRELOAD": f"{example.tools}/libscarce.so", "SCARCE_FILE": "/left",
                                              "SCARCE_PROGRAM": "vvstat"})
        return done, struct.unpack("=q", counter.read_bytes())[0]

    done, left = short_of_memory(MANY)
    assert without_clock(done.stdout) == without_clock(right.stdout)
    allocations = MANY - left
    for n in range(max(1, allocations - 80), allocations + 1):  # the output is made last
        done, left = short_of_memory(n)
        assert left == 0
        if (done.status, done.stdout) != (2, ""):
            assert (done.status, without_clock(done.stdout)) == (right.status, without_clock(right.stdout)), n
        else:
            assert done.stderr == "vvstat: out of memory\n"
