"""Several runs at once: the locks, the format semaphore, formats and resizes of others. And device nodes."""

import os
import re
import signal
import stat

import pytest
from harness import messages
from harness.initiator import store
from harness.volumes import drive, with_result

RUNS = 20


def start(box, operation, *argv):
    """A run of the driver that waits for a line from go()."""
    driver = box.tools / "volume_driver"
    if not box.path("/tmp/go").exists():
        box.run(["mkfifo", "/tmp/go"])
    return box.start(["/bin/sh", "-c", 'exec "$@" <>/tmp/go', "sh", str(driver), operation, *argv])


def go(box):
    box.run(["/bin/sh", "-c", "echo >/tmp/go"])


def result(running):
    return running.wait().lines[-1]


def entered(box, running, word):
    box.wait_until(lambda: word in running.stdout.splitlines(), what=word)


def semaphores(box):
    return box.run(["cat", "/proc/sysvipc/sem"]).lines[1:]


def waiting(box, count):
    """So many runs have asked for the semaphore, besides the one that is in."""
    box.wait_until(lambda: len(box.trace("semop")) >= count + 1, what="waiting runs")


# --- the format semaphore ---


def test_one_format_at_a_time(box):
    first = start(box, "semaphore")
    entered(box, first, "entered")
    others = [start(box, "pass", "/tmp/inside") for _ in range(RUNS)]
    waiting(box, RUNS)
    assert len(semaphores(box)) == 1
    assert all(run.result is None for run in others)
    go(box)
    assert result(first) == "result = 0"
    for run in others:
        assert run.wait().lines[-2:] == ["alone", "result = 0"]
    assert semaphores(box) == [], "the last one removes it"


def test_a_killed_format_lets_the_others_in(box):
    first = start(box, "semaphore")
    entered(box, first, "entered")
    others = [start(box, "pass", "/tmp/inside") for _ in range(5)]
    waiting(box, 5)
    first.kill(signal.SIGKILL)
    for run in others:
        assert run.wait().lines[-2:] == ["alone", "result = 0"]
    assert semaphores(box) == []


def test_a_killed_waiter_is_no_loss(box):
    first = start(box, "semaphore")
    entered(box, first, "entered")
    waiter = start(box, "semaphore")
    waiting(box, 1)
    waiter.kill(signal.SIGKILL)
    assert waiter.wait().status == -signal.SIGKILL
    go(box)
    assert result(first) == "result = 0"
    assert semaphores(box) == []


def test_a_new_format_after_the_last(box):
    for _ in range(3):
        assert drive(box, "pass", "/tmp/inside").result == 0
        assert semaphores(box) == []
    assert box.trace("semctl").count("semctl SETVAL 1") == 3


# What a stranger does with the semaphore; its id is printed.
STRANGER = "import ctypes, os; os.setuid(12345); print(ctypes.CDLL(None).semget(90111, 1, 0o%o))"
# As in the units, which leave a run most rights of root but not that of using what belongs to others.
BOUNDED = ["/usr/bin/setpriv", "--bounding-set", "-ipc_owner"]


@pytest.mark.parametrize("bounds", [[], BOUNDED], ids=["root", "bounded"])
@pytest.mark.parametrize("flags", [0o1666, 0o1600, 0o1000], ids=oct)
def test_a_strangers_semaphore_is_no_hindrance(box, flags, bounds):
    """It has the value 0, so whoever waited for it would wait for ever."""
    assert box.run(["/usr/bin/python3", "-c", STRANGER % flags]).stdout != "-1\n"
    done = with_result(box.run([*bounds, str(box.tools / "volume_driver"), "pass", "/tmp/inside"]))
    assert done.result == 0
    whose = "another user" if bounds and flags != 0o1666 else "user 12345"
    assert f"the format semaphore belongs to {whose}, it is replaced" in messages(done)
    assert semaphores(box) == []


def test_a_stranger_who_waits_for_a_semaphore_that_is_being_made_does_not_get_it(box):
    """Whoever waits for it before it has its value gets in first, and need never leave."""
    take = "made = ctypes.CDLL(None).semget(90111, 1, 0o666); ctypes.CDLL(None).semop(made, struct.pack('Hhh', 0, -1, 0), 1)"
    box.write("/tmp/stranger", f"import ctypes, os, struct, time; os.setuid(12345); {take}; time.sleep(1000)")
    box.write("/tmp/until", "import ctypes, time\nwhile ctypes.CDLL(None).semctl(ctypes.CDLL(None).semget(90111, 1, 0), 0, 14) < 1:\n"
                            "    time.sleep(0.02)  # 14: GETNCNT, how many wait\n")
    box.hook("semctl", re.compile("IPC_SET"), through=True, times=1,
             effect="python3 /tmp/stranger </dev/null >/dev/null 2>&1 & python3 /tmp/until")
    assert drive(box, "pass", "/tmp/inside").result == 0
    assert box.trace("semctl").count("semctl IPC_RMID") >= 2


def test_a_second_lun_is_not_kept_waiting_by_the_first(box):
    """A format that could not write leaves the semaphore to its process, which has the next one to do."""
    store(box, "iqn.t1", luns=[("a", 0, {"dev": "sdb"}), ("b", 1, {"dev": "sdc"})])
    for disk in ("sdb", "sdc"):
        box.hook("sys_get_disk_space", f"/dev/{disk}", ret=256 << 20)
        box.hook("sys_get_partition_list", f"/dev/{disk}", ret=1, out=f"{disk}1")
        box.hook("sys_get_partition_size", f"{disk}1", ret=256 << 20)
        box.hook("sys_check_dev", f"/dev/{disk}1")
        box.hook("sys_get_fs_type", f"/dev/{disk}1", ret=1)
        box.write(f"/dev/{disk}", "")
    box.fake("fuser")
    box.fake("dd", "if=/dev/zero of=/dev/sdb1", status=1)
    box.fake("dd")
    box.fake("mke2fs")
    drive(box, "mount_all", 1)
    assert [call[-1] for call in box.runs("mke2fs")] == ["/dev/sdc1"]
    assert semaphores(box) == []


# --- the recover lock and that of its queue ---


def test_one_run_has_the_recover_lock(box):
    runs = [start(box, "recover_lock") for _ in range(RUNS)]
    box.wait_until(lambda: sum("locked" in run.stdout or "result" in run.stdout for run in runs) == RUNS)
    holders = [run for run in runs if "locked" in run.stdout]
    assert len(holders) == 1
    assert all(result(run) == "result = -1" for run in runs if run is not holders[0])
    go(box)
    assert result(holders[0]) == "result = 0"
    assert box.path("/var/lock/virtual_volume").stat().st_mode & 0o7777 == 0o700
    assert box.path("/var/lock/virtual_volume/remvol_recover.lock").stat().st_mode & 0o7777 == 0o600


@pytest.mark.parametrize("operation", ["recover_lock", "queue_lock"])
def test_a_killed_holder_frees_the_lock(box, operation):
    holder = start(box, operation)
    entered(box, holder, "locked")
    assert drive(box, operation).result == -1
    holder.kill(signal.SIGKILL)
    holder.wait()
    assert drive(box, operation).result == 0


def test_the_queue_lock_is_tried_five_times(box):
    holder = start(box, "queue_lock")
    entered(box, holder, "locked")
    box.forget()
    assert drive(box, "queue_lock").result == -1
    assert len(box.trace("fcntl")) == 5
    assert len(box.trace("usleep")) == 4
    go(box)
    assert result(holder) == "result = 0"


def test_a_command_in_the_background_keeps_no_lock(box):
    """What a run starts does not inherit the descriptor of a lock file."""
    holder = start(box, "recover_lock")
    entered(box, holder, "locked")
    links = [os.readlink(link) for link in box.path(f"/proc/{holder.pid}/fd").iterdir()]
    [lock] = [link for link in links if link.endswith("remvol_recover.lock")]
    number = links.index(lock)
    name = list(box.path(f"/proc/{holder.pid}/fd").iterdir())[number].name
    flags = box.path(f"/proc/{holder.pid}/fdinfo/{name}").read_text().splitlines()[1].split()[1]
    assert int(flags, 8) & os.O_CLOEXEC
    go(box)
    holder.wait()


# --- what others do to a disk ---


def pretend(box, name, *argv):
    """A process of this name and these arguments."""
    box.write(f"/tmp/bin/{name}", "#!/bin/sh\nwhile :; do /bin/sleep 0.02; done\n", 0o755)
    running = box.start([f"/tmp/bin/{name}", *argv], env={"LD_PRELOAD": None})
    box.wait_until(lambda: box.path(f"/proc/{running.pid}/comm").read_text() == f"{name}\n")
    return running


@pytest.fixture
def real_ps(box):
    box.default("ps", real=True)
    return box


def test_a_format_of_another_run_is_seen(real_ps):
    assert drive(real_ps, "formatting").result == 1
    other = pretend(real_ps, "mke2fs", "-j", "/dev/vdb1")
    assert drive(real_ps, "formatting").result == 1
    running = pretend(real_ps, "mke2fs", "-j", "-m0", "/dev/sdb1")
    assert drive(real_ps, "formatting").result == 0
    running.kill()
    running.wait()
    assert drive(real_ps, "formatting").result == 1
    other.kill()


def test_a_resize_of_another_run_is_seen(real_ps):
    running = pretend(real_ps, "resize2fs", "-fp", "/dev/sdb1")
    pretend(real_ps, "resize2fs-log", "/dev/sdc1")
    assert drive(real_ps, "resizing", "/dev/sdb").result == 0
    assert drive(real_ps, "resizing", "/dev/sdb1").result == 0
    assert drive(real_ps, "resizing", "/dev/sdc1").result == 1
    running.kill()
    running.wait()
    assert drive(real_ps, "resizing", "/dev/sdb1").result == 1


def test_a_process_list_with_arguments_is_enough(box):
    box.fake("ps", stdout="  7 root  9999 S  mke2fs -j -m0 -b4096 -T ext4 /dev/sdb1\n  8 root  99 S  resize2fs -fp /dev/sdc1\n")
    assert drive(box, "formatting").result == 0
    assert drive(box, "resizing", "/dev/sdc1").result == 0
    assert drive(box, "resizing", "/dev/sdb1").result == 1


# --- device nodes ---


@pytest.fixture
def disk(box):
    box.disk("sdb", 4 << 20, sysfs=True)
    return box


def numbers(box, name):
    info = box.path(name).stat()
    return stat.S_ISBLK(info.st_mode), os.major(info.st_rdev), os.minor(info.st_rdev)


def test_a_missing_node_is_made(disk):
    known = numbers(disk, "/dev/sdb")
    disk.path("/dev/sdb").unlink()
    assert drive(disk, "node", "sdb").result == 0
    assert numbers(disk, "/dev/sdb") == known
    assert disk.run(["dd", "if=/dev/sdb", "of=/dev/null", "bs=4096", "count=1"], env={"PATH": "/usr/bin"}).status == 0


# What is put at a path, and where the files are that are to stay.
IN_PLACE_OF_A_NODE = {
    "file": (lambda path: path.write_text("no node"), []),
    "link to a file": (lambda path: path.symlink_to("/tmp/kept"), ["/tmp/kept"]),
}


@pytest.mark.parametrize("put, kept", IN_PLACE_OF_A_NODE.values(), ids=IN_PLACE_OF_A_NODE)
def test_something_else_in_place_of_the_node_is_replaced(disk, put, kept):
    known = numbers(disk, "/dev/sdb")
    for file in kept:
        disk.write(file, "a file")
    disk.path("/dev/sdb").unlink()
    put(disk.path("/dev/sdb"))
    assert drive(disk, "node", "sdb").result == 0
    assert numbers(disk, "/dev/sdb") == known
    assert [disk.path(file).read_text() for file in kept] == ["a file"] * len(kept)


def test_a_node_with_other_numbers_is_left(disk):
    disk.path("/dev/sdb").unlink()
    os.mknod(disk.path("/dev/sdb"), stat.S_IFBLK | 0o600, os.makedev(7, 255))
    assert drive(disk, "node", "sdb").result == 0
    assert numbers(disk, "/dev/sdb") == (True, 7, 255)


def test_the_node_of_a_partition_is_made(disk):
    disk.write("/sys/block/sdb/sdb1/dev", "8:17\n")
    assert drive(disk, "node", "sdb1").result == 0
    assert numbers(disk, "/dev/sdb1") == (True, 8, 17)
    disk.path("/dev/sdb1").unlink()
    assert drive(disk, "node", "sdb").result == 0
    assert not disk.path("/dev/sdb1").exists(), "below a disk they are left to the kernel"
