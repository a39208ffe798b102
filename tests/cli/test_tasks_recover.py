"""--oiscsi_evt_reopen and --oiscsi_evt_recover."""

import pytest

from appliance import SLOTS_MOVE, assert_order, settings
from harness import messages
from harness.initiator import INITIATOR, SESSIONS

LOGOUT = 'iscsiadm -m node -T "iqn.t1" --logout'
LOGIN = "iscsiadm -m node -T iqn.t1 -p 10.9.0.2:3260 -I default --login"
QUEUE = "/temp/remvol/recover/queue/id:%d/target_name"
RECOVER_LOCK = "/var/lock/virtual_volume/remvol_recover.lock"
QUEUE_LOCK = "/var/lock/virtual_volume/remvol_recover_queue.lock"
AGAIN = "remvol -w 10 --oiscsi_evt_recover -n iqn.t1 &"
READ_ONLY = "dev %s access right is degraded to ro"
FORMATTING = "One of target:iqn.t1 's LUN is formatting or waitting for format"
RESIZING = "One of target:iqn.t1 's LUN is resizing"
KICKED_BACK = "Skip it now, and kick it back to recover queue"
NOT_SET = "This target iqn.t1 has not been set to connect"


def reopen(box, name="iqn.t1"):
    return box.remvol("--oiscsi_evt_reopen", "-n", name)


def recover(box, *more, name="iqn.t1"):
    return box.remvol(*more, "--oiscsi_evt_recover", "-n", name)


def volume(site, share, dev, number=0, **more):
    return (share, number, {"dev": dev, "mnt_dev": f"/dev/{dev}1", "mnt": f"/mnt/VV/{share}", **more})


@pytest.fixture
def lost(site, box):
    """A target whose connection was lost and is back, with two mounted volumes that survived."""
    site.store("iqn.t1", conn_set=1, conn_state=3,
               luns=[volume(site, "a", "sdb"), volume(site, "b", "sdc", 1)])
    site.offer("iqn.t1", {0: "sdb", 1: "sdc"})
    site.log_in("iqn.t1")
    # What the volumes were mounted with: a table of its own, so that the kernel's can differ.
    box.run(["rm", "-f", "/etc/mtab"])
    box.write("/etc/mtab", "")
    for dev, share in (("sdb", "a"), ("sdc", "b")):
        site.disk(dev)
        site.mount(dev, f"/mnt/VV/{share}")
        with open(box.path("/etc/mtab"), "a") as table:
            table.write(f"/dev/{dev}1 /mnt/VV/{share} ext4 rw,relatime 0 0\n")
    site.debug(1)
    box.forget()
    return site


@pytest.mark.parametrize("handle, function", [(reopen, "task_oiscsi_evt_reopen"), (recover, "task_oiscsi_evt_recover")])
@pytest.mark.parametrize("name", ["iqn.t1", "iqn.nobody"])
def test_the_log_tells_of_begin_and_end(lost, box, handle, function, name):
    lost.debug(2)
    own = messages(handle(box, name=name), function)
    assert (own[0], own[-1]) == ("start", "end")


def degrade(box, share):
    done = box.run(["sh", "-c", f"PATH=/bin:/usr/bin mount -o remount,ro /mnt/VV/{share}"])
    assert done.status == 0, done.stderr


def mount_a_disk(site, box, share, on_top=False):
    """Has the share on a disk of its own, with a file system that takes files."""
    box.path("/dev/sdb1").unlink(missing_ok=True)
    box.disk("sdb1", 8 << 20)
    bare = "true" if on_top else f"umount /mnt/VV/{share}"
    done = box.run(["sh", "-c", f"PATH=/usr/sbin:/usr/bin:/sbin:/bin; {bare} && mkfs.ext4 -q /dev/sdb1 && "
                                f"mount /dev/sdb1 /mnt/VV/{share}"], env={"LD_PRELOAD": None})
    assert done.status == 0, done.stderr


class TestReopen:
    @pytest.mark.parametrize("state", ["0", "1", "2", "4"])
    def test_a_target_that_is_to_be_connected_is_marked(self, site, box, state):
        site.store("iqn.t1", conn_set=1, conn_state=state)
        done = reopen(box)
        assert (done.status, box.tree.get("/result/oiscsi_evt_reopen")) == (0, "0")
        assert site.target("conn_state") == "3"
        assert box.shell() == []

    @pytest.mark.parametrize("conn_set", ["0", "", "no"])
    def test_another_one_is_not(self, site, box, conn_set):
        site.store("iqn.t1", conn_set=conn_set, conn_state=1)
        site.debug(1)
        done = reopen(box)
        assert done.status == 0
        assert NOT_SET in messages(done)
        assert site.target("conn_state") == "1"

    @pytest.mark.parametrize("arguments", [["-n", "iqn.t2"], ["-n", ""], ["-n", "x" * 255], []])
    def test_an_unknown_target(self, site, box, arguments):
        site.store("iqn.t1", conn_set=1, conn_state=1)
        site.debug(1)
        before = settings(box)
        done = box.remvol("--oiscsi_evt_reopen", *arguments)
        name = arguments[1][:255] if arguments else ""
        assert done.status == 255
        assert messages(done)[-2:] == [f"Can not find: {name}", "task_oiscsi_evt_reopen failed"]
        assert settings(box) == before


class TestLostDisk:
    """The session was closed under the volume: nothing shows it but that the disk is gone from sysfs. A write need not
    fail as such: ext4 that cannot read its bitmaps says that it is full."""

    @pytest.mark.parametrize("path, on_top", [("a", False), ("./a", False), ("a/", False), ("a", True)])
    def test_its_volume_is_brought_up_anew(self, lost, box, path, on_top):
        mount_a_disk(lost, box, "a", on_top)
        box.tree.set(f"{INITIATOR}/id:1/lun/id:1/mnt", f"/mnt/VV/{path}")
        done = box.run(["/bin/mount", "-t", "tmpfs", "none", "/sys/dev/block"], env={"LD_PRELOAD": None})
        assert done.status == 0, done.stderr
        assert READ_ONLY % "sdb" in messages(recover(box))
        assert_order(box.shell(), 'umount -f "/mnt/VV/a"', LOGOUT)

    def test_a_volume_with_its_disk_stays(self, lost, box):
        mount_a_disk(lost, box, "a")
        assert READ_ONLY % "sdb" not in messages(recover(box))
        assert not any("umount" in line for line in box.shell())


class TestSurvivedVolumes:
    def test_nothing_is_unmounted(self, lost, box):
        done = recover(box)
        assert (done.status, box.tree.get("/result/oiscsi_evt_recover")) == (0, "0")
        assert "==> Processing - iqn.t1" in messages(done)
        assert_order(lost.trace(), "set id:1/conn_set=1", "set id:1/conn_state=1", "set id:1/status=Connected",
                     "set /result/oiscsi_evt_recover=0")
        assert not any("umount" in line or "fuser" in line or "-m node" in line for line in box.shell())
        assert lost.mounted("a") and lost.mounted("b")

    def test_every_volume_is_asked_by_its_device_with_its_mount_point(self, lost, box):
        recover(box)
        assert_order(
            lost.trace(),
            'system mount -o remount "/mnt/VV/a"',
            "sleep 5",
            "popen ps -w | grep resize2fs | grep -v 'grep'",
            "sleep 1",
            "popen ps -w | grep resize2fs | grep -v 'grep'",
            'system mount -o remount "/mnt/VV/b"',
            "sleep 5",
            "popen ps -w | grep resize2fs | grep -v 'grep'",
            "sleep 1",
            "popen ps -w | grep resize2fs | grep -v 'grep'",
            "set id:1/conn_set=1",
        )

    def test_a_target_without_luns(self, site, box):
        site.store("iqn.t1", conn_set=1, conn_state=3)
        site.offer("iqn.t1", {})
        site.log_in("iqn.t1")
        assert recover(box).status == 0
        assert site.target("status") == "Connected"

    def test_a_target_that_is_gone_shows_so(self, lost, box):
        box.fake("iscsiadm", "-m session", status=21)
        assert recover(box).status == 0
        assert (lost.target("status"), lost.target("conn_state")) == ("Disconnected", "0")

    def test_busy_but_healthy_is_healthy(self, lost, box):
        box.tree.set(f"{INITIATOR}/id:1/lun/id:1/format_state", 1)
        box.fake("ps", stdout="  12 root mke2fs -j /dev/sdb1\n  13 root resize2fs -fp /dev/sdc1\n")
        said = messages(recover(box))
        assert FORMATTING in said and RESIZING in said
        assert lost.target("conn_state") == "1"
        assert not any("oiscsi_evt_recover" in line for line in box.shell())

    def test_a_mount_table_that_cannot_be_read_decides_nothing(self, lost, box):
        box.run(["rm", "/etc/mtab"])
        assert recover(box).status == 0
        assert lost.target("conn_state") == "1"
        assert lost.mounted("a")


@pytest.mark.parametrize("degraded", [False, True])
class TestATargetThatIsTakenAwayMeanwhile:
    def test_it_stays_as_it_was_left(self, lost, box, degraded):
        if degraded:
            degrade(box, "b")
        ktreec = "ktreec -S /var/run/ktree_sock_vv -s"
        box.hook("popen", "ps -w | grep resize2fs | grep -v 'grep'", through=True, times=1,
                 effect=f"{ktreec} {INITIATOR}/id:1/conn_set 0; {ktreec} {INITIATOR}/id:1/conn_state 0")
        done = recover(box)
        assert (done.status, messages(done)[-1]) == (0, NOT_SET)
        assert (lost.target("conn_set"), lost.target("conn_state")) == ("0", "0")
        assert not any("umount" in line or "--log" in line for line in box.shell())


class TestDegradedVolumes:
    def test_the_target_is_rebuilt(self, lost, box):
        degrade(box, "b")
        done = recover(box)
        assert done.status == 0
        assert READ_ONLY % "sdc" in messages(done) and READ_ONLY % "sdb" not in messages(done)
        assert_order(
            lost.trace(),
            'system umount -f "/mnt/VV/a"',
            'system umount -f "/mnt/VV/b"',
            f"system {LOGOUT}",
            "set id:1/conn_state=0",
            "set id:1/conn_state=2",
            "set id:1/conn_state=2",
            "set id:1/status=Connecting",
            f"popen {LOGIN}",
            "set id:1/conn_set=1",
            "set id:1/conn_state=1",
            'system mount -t ext4 /dev/sdb1 "/mnt/VV/a"',
            'system mount -t ext4 /dev/sdc1 "/mnt/VV/b"',
            "set id:1/status=Connected",
            "set /result/oiscsi_evt_recover=0",
        )
        assert [lost.lun("status", n) for n in (1, 2)] == ["Running", "Running"]

    def test_a_volume_that_is_in_no_mount_table_counts_as_degraded(self, lost, box):
        box.write("/etc/mtab", "/dev/sdb1 /mnt/VV/a ext4 rw 0 0\n")
        said = messages(recover(box))
        assert READ_ONLY % "sdc" in said
        assert f"popen {LOGIN}" in lost.trace()

    def test_without_a_disk_the_mounted_node_is_looked_at(self, lost, box):
        box.tree.set(f"{INITIATOR}/id:1/lun/id:1/dev", "")
        degrade(box, "a")
        assert READ_ONLY % "/dev/sdb1" in messages(recover(box))

    def test_ftp_shares_are_taken_down_first(self, lost, box):
        lost.mount("sdc", "/home/Public/b")
        lost.debug(2)
        degrade(box, "b")
        said = messages(recover(box))
        assert_order(said, "Can not find ftp share folder", "umount_ftp : FTP SHARE PATH = /home/Public/b")
        assert_order(lost.trace(), 'system umount -f "/mnt/VV/a"', 'system umount -f "/home/Public/b"',
                     'system umount -f "/mnt/VV/b"', f"system {LOGOUT}")

    def test_an_ftp_share_that_stays_keeps_no_session_that_is_to_heal(self, lost, box):
        for disk in ("sdb", "sdc"):
            box.session_disk(disk, "iqn.t1")
        lost.mount("sdc", "/home/Public/b")
        box.fake("umount", "-f /home/Public/b", status=32, first=True)
        degrade(box, "b")
        recover(box)
        assert LOGOUT in box.shell()

    def test_a_mount_table_that_cannot_be_read_any_more(self, lost, box):
        degrade(box, "b")
        lost.debug(2)
        box.leaks_unchecked()
        box.hook("popen", "ps -w | grep resize2fs | grep -v 'grep'", through=True, skip=3, times=1,
                 effect="mount -t tmpfs none /proc")
        said = messages(recover(box))
        assert said.count("Can not read /proc/mounts") == 2
        assert_order(lost.trace(), f"system {LOGOUT}", f"popen {LOGIN}")

    def test_a_failed_reconnection_is_the_result(self, lost, box):
        degrade(box, "a")
        lost.refuse("iqn.t1")
        done = recover(box)
        assert done.status == 255
        assert "Target_Connect failed , target name = iqn.t1" in messages(done)
        assert (lost.target("conn_state"), lost.target("conn_set")) == ("4", "1")

    def test_a_target_that_vanishes_ends_disconnected(self, lost, box):
        degrade(box, "a")
        # The connection looks the target up again and does not find it: so many reads come before that one, one behind
        # each command at most, and one behind that state.
        box.hook("ktreec_set", f"{INITIATOR}/id:1/conn_state", value="2", through=True, effect=SLOTS_MOVE)
        box.hook("ktreec_get_wb", f"{INITIATOR}/id:1/target", ret=-1, skip=8, times=2)
        assert recover(box).status == 255
        assert lost.target("conn_state") == "0"
        assert_order(lost.trace(), "set id:1/conn_state=2", "set id:1/conn_state=0")

    @pytest.mark.parametrize("left", ["1", None])
    def test_a_lun_that_cannot_be_asked_leaves_a_connected_target_alone(self, lost, box, left):
        degrade(box, "a")
        box.hook("ktreec_get_wb", f"{INITIATOR}/id:1/lun/id:2/enable", ret=-1)
        if left is None:  # nor can the connect state be read at the end
            box.hook("system", "winshare_reload ; macshare_reload", through=True,
                     effect="ktreec -S /var/run/ktree_sock_vv -d /iscsi/initiator/id:1/conn_state")
        assert recover(box).status == 255
        assert lost.target("conn_state") == left

    def test_a_lun_that_cannot_be_read_is_passed_over(self, lost, box):
        degrade(box, "b")
        key = f"{INITIATOR}/id:1/lun/id:1/lun"
        # Read: by the first walk, its look at the format state and its step to the next slot, by the presence check
        # of the second walk, then by the entry.
        box.hook("ktreec_get_wb", f"{INITIATOR}/id:1/target", through=True, effect=SLOTS_MOVE)
        box.hook("ktreec_get_wb", key, ret=-1, skip=4, times=2)
        recover(box)
        umounts = [line for line in box.shell() if line.startswith("umount")]
        assert umounts == ['umount -f "/mnt/VV/b"']


class TestBusyTargets:
    def set_format_state(self, box, state, slot=1):
        box.tree.set(f"{INITIATOR}/id:1/lun/id:{slot}/format_state", state)

    def untouched(self, lost, box):
        box.wait_quiet()
        assert AGAIN in box.shell()
        assert not any("umount" in line or LOGOUT in line for line in box.shell())
        assert lost.target("conn_state") == "3"

    @pytest.fixture(autouse=True)
    def no_second_run(self, box):
        """The run in the background is not what these tests are about."""
        box.hook("system", AGAIN)

    @pytest.mark.parametrize("state", ["1", "4"])
    # How many answers show nothing: asked about is the resizing of the first LUN twice, then the format.
    @pytest.mark.parametrize("silent", [0, 3], ids=["first", "second"])
    def test_a_format_postpones_the_recovery(self, lost, box, state, silent):
        degrade(box, "a")
        self.set_format_state(box, state, slot=2)
        for _ in range(silent):
            box.fake("ps", times=1)
        box.fake("ps", stdout="  12 root mke2fs -j /dev/sdq1\n")
        done = recover(box)
        assert done.status == 0
        assert messages(done).count(FORMATTING) == 1
        assert messages(done)[messages(done).index(FORMATTING) + 1] == KICKED_BACK
        self.untouched(lost, box)

    @pytest.mark.parametrize("state", ["0", "3", "", None])
    def test_the_processes_are_not_looked_at_without_a_format(self, lost, box, state):
        if state is not None:
            self.set_format_state(box, state)
        recover(box)
        assert not any("grep mke2fs" in line for line in box.shell())

    def test_a_format_that_is_gone_does_not_postpone(self, lost, box):
        degrade(box, "a")
        self.set_format_state(box, 1)
        assert recover(box).status == 0
        assert [line for line in box.shell() if "grep mke2fs" in line] == ["ps -w | grep mke2fs | grep -v 'grep'"] * 2
        assert f"popen {LOGIN}" in lost.trace()

    @pytest.mark.parametrize("silent", [0, 1], ids=["first", "second"])
    def test_a_resize_postpones_the_recovery(self, lost, box, silent):
        degrade(box, "a")
        for _ in range(silent):
            box.fake("ps", times=1)
        box.fake("ps", stdout="  12 root resize2fs -fp /dev/sdb1\n")
        done = recover(box)
        assert done.status == 0
        assert messages(done).count(RESIZING) == 1
        assert messages(done)[messages(done).index(RESIZING) + 1] == KICKED_BACK
        self.untouched(lost, box)

    def test_a_resize_of_another_disk_does_not(self, lost, box):
        degrade(box, "a")
        box.fake("ps", stdout="  12 root resize2fs -fp /dev/sdq1\n")
        recover(box)
        assert f"popen {LOGIN}" in lost.trace()


    def test_a_target_that_another_run_is_at_is_postponed_and_holds_up_no_other(self, lost, box):
        degrade(box, "a")
        box.hook("popen", LOGIN, through=True, effect="touch /root/there; until [ -e /root/go ]; do sleep 0.02; done", times=1)
        connect = box.start(["remvol", "--connect", "-n", "iqn.t1"])
        box.wait_until(box.path("/root/there").exists, what="the other run")
        box.tree.set(f"{INITIATOR}/id:1/conn_state", 3)
        done = recover(box)
        assert done.status == 0
        assert "another run is at target iqn.t1, its recovery is put off" in messages(done)
        assert AGAIN in box.shell()
        assert not any("umount" in line or LOGOUT in line for line in box.shell())
        box.path("/root/go").touch()
        assert connect.wait().status == 0


class TestPostponedRun:
    def test_it_comes_back_after_ten_seconds_and_does_the_work(self, lost, box):
        degrade(box, "a")
        box.fake("ps", stdout="  12 root resize2fs -fp /dev/sdb1\n", times=1)
        box.sleep_takes(300)  # it comes back when this run has let go of the recover lock
        assert recover(box).status == 0
        box.wait_quiet()
        assert "sleep 10" in lost.trace()
        assert (lost.target("status"), lost.lun("status")) == ("Connected", "Running")

    def test_it_is_started_as_this_program(self, lost, box):
        degrade(box, "a")
        box.fake("ps", stdout="  12 root resize2fs -fp /dev/sdb1\n")
        path = f"{box.build}/bin/remvol"
        box.hook("system", f"{path} -w 10 --oiscsi_evt_recover -n iqn.t1 &")
        box.run([path, "--oiscsi_evt_recover", "-n", "iqn.t1"])
        assert f"{path} -w 10 --oiscsi_evt_recover -n iqn.t1 &" in box.shell()


class TestNotToBeRecovered:
    @pytest.mark.parametrize(
        "conn_set, conn_state", [("1", "1"), ("1", "0"), ("1", "2"), ("1", "4"), ("1", ""), ("0", "3"), ("", "3")])
    def test_only_a_lost_target_that_is_to_be_connected(self, lost, box, conn_set, conn_state):
        box.tree.set({f"{INITIATOR}/id:1/conn_set": conn_set, f"{INITIATOR}/id:1/conn_state": conn_state})
        before = settings(box)
        done = recover(box)
        assert done.status == 0
        assert NOT_SET in messages(done)
        assert settings(box) == before
        assert box.shell() == []

    @pytest.mark.parametrize("arguments", [["-n", "iqn.t2"], ["-n", ""], ["-n", "x" * 255], []])
    def test_an_unknown_target(self, lost, box, arguments):
        before = settings(box)
        done = box.remvol("--oiscsi_evt_recover", *arguments)
        name = arguments[1][:255] if arguments else ""
        assert done.status == 255
        assert_order(messages(done), f"==> Processing - {name}", f"Can not find: {name}",
                     "task_oiscsi_evt_reopen failed")
        assert settings(box) == before


class TestQueue:
    def queue(self, box, *names):
        box.tree.set({QUEUE % n: name for n, name in enumerate(names, start=1)})

    def hold(self, box, path):
        """Another process holds a lock."""
        code = ("import fcntl, sys, time; f = open(sys.argv[1], 'w'); fcntl.lockf(f, fcntl.LOCK_EX); "
                "print('held', flush=True); time.sleep(1000)")
        box.path(path).parent.mkdir(mode=0o700, exist_ok=True)
        holder = box.start(["/usr/bin/python3", "-c", code, path], env={"LD_PRELOAD": None})
        box.wait_until(lambda: holder.stdout == "held\n")
        return holder

    def test_the_queue_is_worked_off_oldest_first(self, lost, box):
        lost.store("iqn.t2", slot=2, conn_set=1, conn_state=3)
        self.queue(box, "iqn.t9", "iqn.t2")
        done = recover(box)
        assert [line for line in messages(done) if line.startswith("==>")] == [
            "==> Processing - iqn.t1", "==> Processing - iqn.t9", "==> Processing - iqn.t2"]
        assert done.status == 0
        assert lost.target("status", 2) == "Disconnected"
        assert not any(key.startswith("/temp") for key in settings(box))

    def test_the_result_is_that_of_the_last_target(self, lost, box):
        self.queue(box, "iqn.t9")
        assert recover(box).status == 255
        assert lost.target("conn_state") == "1"

    def test_the_lock_is_held_for_the_whole_queue(self, lost, box):
        self.queue(box, "iqn.t9")
        recover(box)
        files = {call.fields[1] for call in box.calls if call.kind == "fcntl"}
        assert {str(box.path(file)) for file in files} == {str(box.path(RECOVER_LOCK))}
        kinds = [call.kind for call in box.calls if call.kind in ("fcntl", "del")]
        assert kinds == ["fcntl", "del", "fcntl"]

    def test_a_queue_entry_that_cannot_be_deleted_ends_the_run(self, lost, box):
        self.queue(box, "iqn.t2")
        box.hook("ktreec_del", "/temp/remvol/recover/queue/id:1", ret=-1)
        done = recover(box)
        assert done.status == 0
        assert "==> Processing - iqn.t2" not in messages(done)

    def test_a_target_that_is_queued_behind_the_last_look_is_recovered(self, lost, box):
        lost.store("iqn.t2", slot=2, conn_set=1, conn_state=3)
        lost.offer("iqn.t2", {})
        lost.log_in("iqn.t2")
        box.hook("fcntl", "unlock", through=True, times=1,
                 effect="touch /tmp/unlocking; until [ -e /tmp/go ]; do sleep 0.01; done")
        first = box.start(["remvol", "--oiscsi_evt_recover", "-n", "iqn.t1"])
        box.wait_until(box.path("/tmp/unlocking").exists, what="the end of the queue")
        assert recover(box, name="iqn.t2").status == 0
        assert (box.tree.get(QUEUE % 1), lost.target("conn_state", 2)) == ("iqn.t2", "3")
        box.write("/tmp/go", "")
        assert first.wait().status == 0
        assert (box.tree.get(QUEUE % 1), lost.target("conn_state", 2)) == (None, "1")

    def test_what_another_run_takes_over_is_left_to_it(self, lost, box):
        """Behind the unlock the queue is another run's, which has the lock again."""
        box.hook("fcntl", "unlock", through=True, times=1, effect=f"ktreec -S /var/run/ktree_sock_vv -s {QUEUE % 1} iqn.t2")
        box.hook("fcntl", "lock", ret=-1, errno=11, skip=1, times=1)
        assert recover(box).status == 0
        assert box.tree.get(QUEUE % 1) == "iqn.t2"

    def test_while_another_run_recovers_the_target_is_queued(self, lost, box):
        holder = self.hold(box, RECOVER_LOCK)
        self.queue(box, "iqn.t9")
        done = recover(box)
        holder.kill()
        holder.wait()
        assert (done.status, box.tree.get(QUEUE % 2)) == (0, "iqn.t1")
        assert "==> insert queue - iqn.t1" in messages(done)
        assert not any("Processing" in line for line in messages(done))
        assert lost.target("conn_state") == "3"
        locks = [(call.fields[0], call.fields[1].split("/")[-1]) for call in box.calls if call.kind == "fcntl"]
        assert locks[-2:] == [("lock", "remvol_recover_queue.lock"), ("unlock", "remvol_recover_queue.lock")]

    @pytest.mark.parametrize("error", [13, 11, 5])
    def test_any_failure_to_get_the_lock_queues_the_target(self, lost, box, error):
        box.hook("fcntl", "lock", ret=-1, errno=error, times=1)
        assert recover(box).status == 0
        assert box.tree.get(QUEUE % 1) == "iqn.t1"

    def test_a_lock_file_that_cannot_be_opened_queues_the_target(self, lost, box):
        box.path("/var/lock/virtual_volume").mkdir(parents=True)
        box.path(RECOVER_LOCK).mkdir()
        assert recover(box).status == 0
        assert box.tree.get(QUEUE % 1) == "iqn.t1"

    def test_a_queue_that_stays_locked_loses_the_event(self, lost, box):
        holders = [self.hold(box, path) for path in (RECOVER_LOCK, QUEUE_LOCK)]
        done = recover(box)
        for holder in holders:
            holder.kill()
            holder.wait()
        assert done.status == 255
        assert "lock failed for iqn.t1, skip and exit" in messages(done)
        assert box.tree.get(QUEUE % 1) is None
        waits = box.trace("usleep")
        assert len(waits) == 4 and all(int(line.split()[1]) < 100000 for line in waits)

    def test_runs_of_the_same_second_do_not_wait_alike(self, lost, box):
        holders = [self.hold(box, path) for path in (RECOVER_LOCK, QUEUE_LOCK)]
        waits = []
        for _ in range(3):
            box.forget()
            recover(box)
            waits.append(tuple(box.trace("usleep")))
        for holder in holders:
            holder.kill()
            holder.wait()
        assert len(set(waits)) == 3

    def test_a_full_queue(self, lost, box):
        self.queue(box, *(f"iqn.q{n}" for n in range(100)))
        holder = self.hold(box, RECOVER_LOCK)
        done = recover(box)
        holder.kill()
        holder.wait()
        assert done.status == 255
        assert "db failed or exceed max queue length" in messages(done)

    def test_a_queue_that_the_tree_does_not_take(self, lost, box):
        holder = self.hold(box, RECOVER_LOCK)
        box.hook("ktreec_set", QUEUE % 1, ret=-1)
        done = recover(box)
        holder.kill()
        holder.wait()
        assert done.status == 255

    def test_without_a_lock_folder_nothing_is_done(self, lost, box):
        box.run(["sh", "-c", "folder=$(readlink -f /var/lock); rm -rf $folder; : >$folder"])
        before = settings(box)
        done = recover(box)
        assert done.status == 255
        assert "create lock directory failed" in messages(done)
        assert settings(box) == before

    def test_events_of_eight_targets_are_recovered_by_one_run(self, site, box):
        names = [f"iqn.t{n}" for n in range(1, 9)]
        for slot, name in enumerate(names, start=1):
            site.store(name, slot=slot, conn_set=1, conn_state=3)
            site.offer(name, {})
            site.log_in(name)
        site.debug(1)
        # The first run is busy with its own target until the others have queued theirs.
        box.hook("system", SESSIONS, through=True, times=1,
                 effect="touch /tmp/busy; until [ -e /tmp/go ]; do sleep 0.01; done")
        first = box.start(["remvol", "--oiscsi_evt_recover", "-n", names[0]])
        box.wait_until(lambda: box.path("/tmp/busy").exists())
        assert [recover(box, name=name).status for name in names[1:]] == [0] * 7
        assert [box.tree.get(QUEUE % n) for n in range(1, 9)] == [*names[1:], None]
        box.write("/tmp/go", "")
        done = first.wait()
        assert done.status == 0
        assert [line for line in messages(done) if line.startswith("==>")] == [
            f"==> Processing - {name}" for name in names]
        assert [site.target("status", n) for n in range(1, 9)] == ["Connected"] * 8


class TestWait:
    @pytest.mark.parametrize("seconds", ["10", "1"])
    def test_it_waits_before_anything_else(self, lost, box, seconds):
        done = recover(box, "-w", seconds)
        assert f"Sleep {seconds} seconds before add iqn.t1 to recover queue..." in messages(done)
        assert_order(lost.trace(), "set /result/oiscsi_evt_recover=", f"sleep {seconds}", "set id:1/conn_set=1")

    @pytest.mark.parametrize("seconds", ["0", "-3", "soon"])
    def test_it_does_not_wait_for_nothing(self, lost, box, seconds):
        done = recover(box, "-w", seconds)
        assert not any(line.startswith("Sleep") for line in messages(done))
