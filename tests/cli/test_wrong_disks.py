"""Nothing destructive reaches a disk that is not the LUN's own, or that somebody else has put to use."""

import re

import pytest
from appliance import settings
from harness import messages
from harness.initiator import INITIATOR
from harness.sysaux import image
from harness.volumes import drive, luns

__all__ = ["luns"]

MIB = 1 << 20
LEFT_ALONE = "is not the disk of LUN 0 of iqn.t1, it is left alone"

# Whose disk the name sdb may be, and how the box is told so.
OTHERS = {
    "another target": lambda box: box.session_disk("sdb", "iqn.t2"),
    "another LUN": lambda box: box.session_disk("sdb", "iqn.t1", lun=1),
    "a disk of the machine": lambda box: box.local_disk("sdb"),
}
THE_LUNS = {
    "the LUN's own": lambda box: box.session_disk("sdb", "iqn.t1", lun=0),
    "nobody's, as far as known": lambda box: None,
}


def turns_into_another(disk="sdb"):
    """Shell text: the name belongs to another target from now on."""
    return f"ln -sfn /fake/other/host9/session9/target9:0:0/9:0:0:0 /sys/block/{disk}/device"


@pytest.fixture
def volume(volume, box):
    """That of conftest.py; and another target's disk to turn into."""
    other = "/fake/other/host9/session9"
    box.write(f"{other}/iscsi_session/session9/targetname", "iqn.t2\n")
    box.path(f"{other}/target9:0:0/9:0:0:0").mkdir(parents=True)
    return volume


GOES = "rm /sys/block/sdb/device"  # shell text: the disk is gone, and its name another one's any moment

# How the box is told what happens to the disk, and the commands on it that have begun by then.
DURING_A_FORMAT = {
    "it moves away before it": (
        lambda box: box.hook("semop", re.compile("^-1"), through=True, effect=turns_into_another()), []),
    "it moves away at fuser": (lambda box: box.fake("fuser", effect=turns_into_another(), first=True), ["fuser"]),
    "it moves away at dd": (lambda box: box.fake("dd", effect=turns_into_another(), first=True), ["fuser", "dd"]),
    "it goes at fuser": (lambda box: box.fake("fuser", effect=GOES, first=True), ["fuser"]),
    "it goes at dd": (lambda box: box.fake("dd", effect=GOES, first=True), ["fuser", "dd"]),
}

PARTITIONS = "mkdir /sys/block/sdb/sdb1; : >/sys/block/sdb/sdb1/partition"  # shell text: another run makes a partition


def ran(box, *words):
    return [line for line in box.shell() if any(word in line for word in words)]


class TestNamesThatMoved:
    @pytest.mark.parametrize("turn", OTHERS.values(), ids=OTHERS)
    def test_a_format_fails_and_touches_nothing(self, volume, box, turn):
        turn(box)
        before = settings(box)
        done = box.remvol("--format", "-n", "iqn.t1", "-l", "0")
        assert (done.status, messages(done)) == (255, [f"sdb {LEFT_ALONE}"])
        assert settings(box) == before
        assert box.shell() == ["winshare_reload"]
        assert volume.mounted("data")

    @pytest.mark.parametrize("turn", THE_LUNS.values(), ids=THE_LUNS)
    def test_its_own_disk_is_formatted(self, volume, box, turn):
        turn(box)
        assert box.remvol("--format", "-n", "iqn.t1", "-l", "0").status == 0
        assert [words[-1] for words in box.runs("mke2fs")] == ["/dev/sdb1"]

    @pytest.mark.parametrize("turn", OTHERS.values(), ids=OTHERS)
    def test_a_disconnect_does_not_end_the_others_users(self, volume, box, turn):
        turn(box)
        box.tree.set(f"{INITIATOR}/id:1/lun/id:1/mnt_dev", "/dev/sdb2")
        volume.mount_anew("sdc", "/mnt/VV/data")
        done = box.remvol("--disconnect", "-n", "iqn.t1")
        assert done.status == 0
        assert f"/dev/sdb2 {LEFT_ALONE}" in messages(done)
        assert ran(box, "fuser") == ['fuser -mk "/mnt/VV/data"']
        assert not volume.mounted("data")

    def test_a_disconnect_ends_its_own_users(self, volume, box):
        THE_LUNS["the LUN's own"](box)
        assert box.remvol("--disconnect", "-n", "iqn.t1").status == 0
        assert ran(box, "fuser") == ["fuser -mk /dev/sdb1", 'fuser -mk "/mnt/VV/data"']

    @pytest.mark.parametrize("turn", OTHERS.values(), ids=OTHERS)
    def test_another_volumes_ftp_mount_stays(self, volume, box, turn):
        volume.mount("sdb", "/home/Public/other")
        assert drive(box, "ftp_path", 1, 1).result == 0
        turn(box)
        assert drive(box, "ftp_path", 1, 1).result == -104

    @pytest.mark.parametrize("turn", OTHERS.values(), ids=OTHERS)
    def test_a_wrong_disk_is_not_mounted_but_counts_as_offline(self, site, box, turn):
        site.store("iqn.t1", luns=[("data", 0)])
        site.offer("iqn.t1", {0: "sdb"})
        site.disk("sdb", parts=0)
        turn(box)
        done = box.remvol("--connect", "-n", "iqn.t1")
        assert done.status == 0
        assert f"/dev/sdb {LEFT_ALONE}" in messages(done)
        assert site.lun("volume_state") == "2"
        assert not ran(box, "mkdir", "mount ", "fuser", "dd", "mke2fs")
        assert not box.trace("sys_create_1_partition")

    @pytest.mark.parametrize("parts, call", [(0, "sys_create_1_partition"), (1, "sys_expand_1_partition")])
    def test_a_disk_that_moves_away_is_not_partitioned(self, volume, box, parts, call):
        box.session_disk("sdb", "iqn.t1")
        box.hook("sys_get_partition_list", "/dev/sdb", ret=parts, out="sdb1" if parts else "",
                 effect=turns_into_another(), first=True)
        box.hook("sys_get_partition_size", "sdb1", ret=8 * MIB, first=True)
        box.fake("mount", first=True)
        drive(box, "mount", 1, 1, 0, 0)
        assert not box.trace(call)

    @pytest.mark.parametrize("happens, reached", DURING_A_FORMAT.values(), ids=DURING_A_FORMAT)
    def test_a_disk_that_moves_away_during_a_format(self, volume, box, happens, reached):
        box.session_disk("sdb", "iqn.t1")
        happens(box)
        done = drive(box, "format", 1, 1, "/dev/sdb1")
        assert done.result == -1
        assert f"/dev/sdb1 {LEFT_ALONE}" in messages(done)
        assert [line.split()[0] for line in ran(box, "fuser", "dd if", "mke2fs")] == reached
        assert volume.lun("format_state") == "3"
        assert box.run(["cat", "/proc/sysvipc/sem"]).lines[1:] == [], "the semaphore is left"


    @pytest.mark.parametrize("step", ["fuser", "dd", "mke2fs"])
    def test_a_disk_keeps_its_name_while_it_is_formatted(self, volume, box, step):
        box.fake(step, effect="ls -l /proc/[0-9]*/fd 2>/dev/null | grep -c '/dev/sdb$' >/root/open", first=True)
        drive(box, "format", 1, 1, "/dev/sdb1")
        assert box.path("/root/open").read_text() == "1\n", "whoever has the disk open keeps its name from being given anew"

    @pytest.mark.parametrize("change", [turns_into_another(), GOES])
    def test_a_disk_that_moves_away_before_the_mount_is_not_mounted(self, volume, box, change):
        box.run(["umount", "/mnt/VV/data"], env={"LD_PRELOAD": None, "PATH": "/bin:/usr/bin"})
        box.session_disk("sdb", "iqn.t1")
        box.hook("sys_check_fs_state", "/dev/sdb1", effect=change, first=True)
        done = box.remvol("--connect", "-n", "iqn.t1")
        assert f"/dev/sdb1 {LEFT_ALONE}" in messages(done)
        assert not ran(box, "mkdir", "mount -t")
        assert (done.status, volume.lun("volume_state")) == (0, "2")


class TestMountPointsOfOthers:
    """Another disk is mounted where the share's volume belongs: one that was mounted for an add whose tree was
    started anew, so that the share name was given again."""

    @pytest.mark.parametrize("turn", OTHERS.values(), ids=OTHERS)
    def test_it_is_not_unmounted(self, volume, box, turn):
        turn(box)
        box.tree.set(f"{INITIATOR}/id:1/lun/id:1/mnt_dev", "/dev/sdb2")
        done = drive(box, "unmount", 1, 1)
        assert done.result == -1
        assert messages(done) == [f"/dev/sdb2 {LEFT_ALONE}", f"/dev/sdb1 {LEFT_ALONE}"]
        assert volume.mounted("data")
        assert not ran(box, "fuser", "umount", "remount", "rm -rf")

    def test_a_volume_that_has_lost_its_disk_is_taken_away(self, volume, box):
        box.session_disk("sdb", "iqn.t1")
        box.fake("fuser", "-mk /dev/sdb1", effect="rm -r /sys/block/sdb", first=True)
        assert box.remvol("--disconnect", "-n", "iqn.t1").status == 0
        assert not volume.mounted("data")

    @pytest.mark.parametrize("turn", OTHERS.values(), ids=OTHERS)
    def test_nothing_is_mounted_over_it(self, volume, box, turn):
        turn(box)
        volume.offer("iqn.t1", {0: "sdc"})
        volume.disk("sdc")
        box.session_disk("sdc", "iqn.t1", session=2)
        done = box.remvol("--connect", "-n", "iqn.t1")
        assert f"/dev/sdb1 {LEFT_ALONE}" in messages(done)
        assert (done.status, volume.lun("volume_state")) == (0, "3")
        assert not ran(box, "mkdir", "mount -t", "chmod", "rm -rf")

    @pytest.mark.parametrize("turn", [OTHERS["another target"], OTHERS["another LUN"]], ids=["another target", "another LUN"])
    def test_its_share_name_is_not_given_again(self, site, box, turn):
        site.mount("sdb", "/mnt/VV/data")
        turn(box)
        done = box.remvol("--add", "-n", "iqn.t1", "-l", "0", "-i", "10.9.0.2", "-p", "3260", "-s", "data")
        assert (done.status, site.lun("share")) == (255, None)
        assert messages(done) == [f"/dev/sdb1 {LEFT_ALONE}", "share name data has benn used"]

    def test_its_own_lun_gets_it_back(self, site, box):
        site.mount("sdb", "/mnt/VV/data")
        THE_LUNS["the LUN's own"](box)
        done = box.remvol("--add", "-n", "iqn.t1", "-l", "0", "-i", "10.9.0.2", "-p", "3260", "-s", "data")
        assert (done.status, site.lun("share")) == (0, "data")


def while_waiting(box, effect):
    """What another run does before this one gets the semaphore."""
    box.hook("semop", re.compile("^-1"), through=True, effect=effect)


def formatted(box):
    return ran(box, "dd if", "mke2fs")


class TestOtherRuns:
    """Two runs found the same LUN empty; the other one was quicker."""

    @pytest.fixture
    def lun(self, luns):
        lun = luns(64 * MIB)
        lun.disk.sfdisk("label: gpt\nstart=2048,type=L\n")
        lun.box.run(["/usr/bin/partx", "-a", lun.disk.node])
        return lun

    def make(self, lun):
        return f"mke2fs -q -t ext4 -L theirs {lun.disk.part}"

    def label(self, lun):
        return lun.box.run(["/usr/sbin/blkid", "-p", "-o", "value", "-s", "LABEL", lun.disk.part]).stdout.strip()

    def test_what_was_formatted_meanwhile_is_mounted(self, lun):
        while_waiting(lun.box, self.make(lun))
        done = lun.mount()
        assert done.result == 0
        assert f"{lun.disk.part} carries ext4 by now, it is not formatted" in messages(done)
        assert not formatted(lun.box)
        assert not ran(lun.box, "fuser")
        assert (self.label(lun), lun.mounted()) == ("theirs", True)
        assert [lun.key(key) for key in ("format_state", "volume_state")] == ["0", "0"]

    def test_a_new_partition_that_was_formatted_meanwhile_too(self, luns):
        lun = luns(64 * MIB)
        while_waiting(lun.box, self.make(lun))
        assert lun.mount().result == 0
        assert not formatted(lun.box)
        assert self.label(lun) == "theirs"

    @pytest.mark.parametrize("kind", ["btrfs", "jfs", "udf"])
    def test_nor_what_has_its_signature_further_in(self, lun, kind):
        content = image(kind)
        assert not any(content[:4096]), "the beginning stays as it was"
        lun.box.path("/root/theirs").write_bytes(content)
        while_waiting(lun.box, f"cat /root/theirs >{lun.disk.part}")
        done = lun.mount()
        assert not formatted(lun.box)
        assert not ran(lun.box, "fuser", "mount -t")
        assert f"{lun.disk.part} carries {kind} by now, it is not formatted" in messages(done)
        assert (done.result, lun.key("format_state"), lun.key("volume_state")) == (-6, "0", "5")
        with open(lun.disk.part, "rb") as partition:
            assert partition.read(len(content)) == content

    @pytest.mark.parametrize("use, label", [("", ""), ("mount {0} /mnt/other; umount /mnt/other", "earlier")],
                             ids=["untouched", "used meanwhile"])
    def test_what_an_earlier_partition_left(self, lun, use, label):
        """It is seen in the new partition, which is formatted unless somebody has used it in between."""
        lun.box.run(["/usr/sbin/mke2fs", "-q", "-t", "ext4", "-L", "earlier", lun.disk.part])
        lun.disk.forget()
        lun.disk.wipe_ends()
        lun.box.path("/mnt/other").mkdir()
        while_waiting(lun.box, use.format(lun.disk.part) or ":")
        assert lun.mount().result == 0
        assert (bool(formatted(lun.box)), self.label(lun), lun.mounted()) == (not use, label, True)

    def test_what_was_mounted_meanwhile_stays(self, lun):
        while_waiting(lun.box, f"{self.make(lun)}; mkdir -p {lun.mount_point}; mount {lun.disk.part} {lun.mount_point}; "
                               f"echo data >{lun.mount_point}/file")
        done = lun.mount()
        assert done.result == 0
        assert f"{lun.disk.part} is mounted by now, it is not formatted" in messages(done)
        assert not formatted(lun.box)
        assert not ran(lun.box, "fuser", "mount -t")
        assert lun.read_file("file") == b"data\n"
        assert [lun.key(key) for key in ("format_state", "volume_state")] == ["0", "0"]

    def test_a_format_that_was_asked_for_goes_on(self, lun):
        while_waiting(lun.box, self.make(lun))
        assert lun.mount(force=1).result == 0
        assert self.label(lun) == ""
        assert lun.mounted()

    def test_not_even_that_formats_a_mounted_disk(self, lun):
        while_waiting(lun.box, f"{self.make(lun)}; mkdir /mnt/other; mount {lun.disk.part} /mnt/other")
        assert lun.mount(force=1).result == -3
        assert not formatted(lun.box)
        assert not ran(lun.box, "fuser")
        assert self.label(lun) == "theirs"

    def test_nor_one_that_was_never_unmounted(self, lun):
        assert lun.mount().result == 0
        lun.write_file("file", b"data")
        lun.box.forget()
        assert lun.mount(force=1).result == -3
        assert not formatted(lun.box)
        assert lun.read_file("file") == b"data"

    def test_nor_one_that_is_in_use_unseen(self, lun):
        lun.box.fake("fuser")
        hold = f"import os, time; os.open('{lun.disk.part}', os.O_RDONLY | os.O_EXCL); print('held', flush=True); time.sleep(99)"
        holder = lun.box.start(["/usr/bin/python3", "-c", hold], env={"LD_PRELOAD": None})
        lun.box.wait_until(lambda: "held" in holder.stdout)
        done = lun.mount(force=1)
        assert done.result == -3
        assert f"{lun.disk.part} is in use, it is not formatted" in messages(done)
        assert not formatted(lun.box)
        assert len(lun.box.trace("usleep")) == 10

    def test_a_written_partition_that_carries_nothing_is_formatted(self, lun):
        while_waiting(lun.box, f"head -c 4096 /dev/urandom >{lun.disk.part}")
        assert lun.mount().result == 0
        assert formatted(lun.box)
        assert lun.mounted()

    def mount_empty_disk(self, box, while_listed=None, while_created=None):
        box.write("/sys/block/sdb/size", "1\n")
        box.hook("sys_get_partition_list", "/dev/sdb", ret=0, out="", times=1, first=True, effect=while_listed)
        box.hook("sys_create_1_partition", "/dev/sdb", ret=1, effect=while_created)
        return drive(box, "mount", 1, 1, 0, 0)

    @pytest.mark.parametrize("effect, creates", [({"while_listed": PARTITIONS}, 0), ({"while_created": PARTITIONS}, 1)],
                             ids=["list-0", "create-1"])
    def test_a_disk_that_was_partitioned_meanwhile(self, volume, box, effect, creates):
        assert self.mount_empty_disk(box, **effect).result == 0
        assert len(box.trace("sys_create_1_partition")) == creates
        assert not formatted(box), "what the other run's partition carries is kept"
        assert volume.lun("volume_state") == "0"

    def test_a_partition_that_nobody_made_stays_a_failure(self, volume, box):
        assert self.mount_empty_disk(box).result == -2


class TestUdev:
    """udev looks at a new partition: whoever uses the node then is not to be killed."""

    def waits(self, box):
        return box.trace("usleep").count("usleep 100000")

    @pytest.mark.parametrize("argv", [("format", 1, 1, "/dev/sdb1"), ("unmount", 1, 1)])
    def test_its_pending_events_are_waited_for(self, volume, box, argv):
        box.write("/run/udev/queue", "")
        box.hook("usleep", "100000", skip=2, times=1, through=True, effect="rm /run/udev/queue")
        drive(box, *argv)
        assert self.waits(box) == 3
        trace = box.trace()
        assert trace.index("usleep 100000") < min(i for i, line in enumerate(trace) if "fuser -mk" in line)

    @pytest.mark.parametrize("argv", [("format", 1, 1, "/dev/sdb1"), ("unmount", 1, 1)])
    def test_what_comes_while_another_run_looks_at_the_disk_is_waited_for(self, volume, box, argv):
        assert box.remvol("--status").status == 0  # looks, and so there is a lock for it
        look = "exec 9</run/remvol/look-*.lock; flock -s 9; echo held; exec sleep 1000"
        other = box.start(["/bin/bash", "-c", look], env={"LD_PRELOAD": None, "PATH": "/usr/bin:/bin"})
        box.wait_until(lambda: other.stdout == "held\n")
        box.path("/run/udev").mkdir()
        box.hook("usleep", "20000", skip=2, times=1, through=True,
                 effect=f"touch /run/udev/queue; kill {other.pid}; while kill -0 {other.pid}; do :; done")
        box.hook("usleep", "100000", skip=2, times=1, through=True, effect="rm /run/udev/queue")
        drive(box, *argv)
        trace = box.trace()
        assert trace.count("usleep 20000") == 3 and self.waits(box) == 3
        assert trace.index("usleep 100000") < min(i for i, line in enumerate(trace) if "fuser -mk" in line)

    @pytest.mark.parametrize("argv", [("format", 1, 1, "/dev/sdb1"), ("unmount", 1, 1)])
    def test_meanwhile_other_runs_look_at_the_disk(self, volume, box, argv):
        assert box.remvol("--status").status == 0  # looks, and so there is a lock for it
        box.write("/run/udev/queue", "")
        box.hook("usleep", "100000", skip=2, times=1, through=True,
                 effect="flock -ns /run/remvol/look-* touch /looked; rm /run/udev/queue")
        drive(box, *argv)
        assert box.path("/looked").exists() and self.waits(box) == 3

    def test_but_not_for_ever(self, volume, box):
        box.write("/run/udev/queue", "")
        drive(box, "unmount", 1, 1)
        assert self.waits(box) == 50
        assert ran(box, "fuser")

    def test_its_lock_on_the_disk_is_waited_for(self, volume, box):
        box.path("/run/udev").mkdir()
        box.path("/dev/sdb").unlink()
        box.disk("sdb", 4 * MIB)
        look = "import fcntl, time; f = open('/dev/sdb'); fcntl.flock(f, fcntl.LOCK_SH); print('looks', flush=True); time.sleep(99)"
        worker = box.start(["/usr/bin/python3", "-c", look], env={"LD_PRELOAD": None})
        box.wait_until(lambda: "looks" in worker.stdout)
        box.hook("usleep", "100000", skip=2, times=1, through=True, effect=f"kill {worker.pid}; while kill -0 {worker.pid}; do :; done")
        drive(box, "unmount", 1, 1)
        assert 3 <= self.waits(box) < 50

    def test_without_udev_nothing_is_waited_for(self, volume, box):
        drive(box, "unmount", 1, 1)
        assert self.waits(box) == 0
