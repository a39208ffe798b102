"""Runs beside one another, and what a killed run leaves to the next."""

import json
import os
import posixpath
import re
import signal
import time

import pytest

from appliance import SLOTS_MOVE
from harness import messages
from harness.initiator import INITIATOR, SHARES

LOGIN = re.compile("^iscsiadm -m node -T iqn.t1 .*--login$")
MOUNT = re.compile("^mount -t ext4 ")


@pytest.fixture
def stored(site):
    """A target with a LUN, offered by its portal but not logged in."""
    site.store("iqn.t1", conn_set=0, luns=[("a", 0)])
    site.offer("iqn.t1", {0: "sdb"})
    site.disk("sdb")
    return site


def status(box):
    done = box.remvol("--status")
    assert done.status == 0
    return done


def until(condition, seconds=10):
    end = time.monotonic() + seconds
    while not condition():
        assert time.monotonic() < end, "waited for too long"
        time.sleep(0.02)


def meet(box, function, what):
    """The next run that comes to the call waits there until go_on(); sleeps take some time from now on."""
    box.sleep_takes(10)
    passed_on = function != "sys_create_1_partition"
    box.hook(function, what, through=passed_on, times=1, effect="touch /root/there; until [ -e /root/go ]; do sleep 0.02; done")


def is_there(box):
    return box.path("/root/there").exists()


def go_on(box):
    box.path("/root/go").touch()


def comes_true(condition, seconds=0.7):
    end = time.monotonic() + seconds
    while not condition() and time.monotonic() < end:
        time.sleep(0.02)
    return condition()


def held(box, lock):
    """Shell text that says whether the lock is held: "1" in /root/held."""
    return f"flock -n /run/remvol/{lock} true; echo $? >/root/held"


class TestStandingBehindAState:
    def test_a_connection_under_way_stays_connecting(self, stored, box):
        box.hook("popen", LOGIN, through=True, delay=1)
        run = box.start(["remvol", "--connect", "-n", "iqn.t1"])
        until(lambda: any(call.kind == "popen" for call in box.calls))
        status(box)
        assert (stored.target("status"), stored.target("conn_state")) == ("Connecting", "2")
        assert run.wait().status == 0
        assert (stored.target("status"), stored.lun("status")) == ("Connected", "Running")

    def test_a_killed_connection_is_put_right(self, stored, box):
        box.hook("popen", LOGIN, through=True, effect="kill -KILL $PPID", times=1)
        assert box.remvol("--connect", "-n", "iqn.t1").status == -9
        assert stored.target("conn_state") == "2"
        status(box)
        assert (stored.target("status"), stored.target("conn_state")) == ("Disconnected", "0")

    def test_a_state_that_nobody_is_known_to_have_worked_on_stays(self, stored, box):
        box.tree.set(f"{INITIATOR}/id:1/conn_state", 2)
        status(box)
        assert stored.target("status") == "Connecting"

    @staticmethod
    def read_as(box, key, value, then):
        """The next run reads the value; directly behind that another one stores `then` and ends."""
        box.tree.set(key, value)
        box.hook("ktreec_get_wb", key, ret=1, out=str(value), times=1,
                 effect=f"ktreec -S /var/run/ktree_sock_vv -s {key} {then}")

    def test_a_connection_that_fails_just_now_stays_failed(self, stored, box):
        stored.refuse("iqn.t1")
        box.remvol("--connect", "-n", "iqn.t1")
        self.read_as(box, f"{INITIATOR}/id:1/conn_state", 2, then=4)
        status(box)
        assert (stored.target("status"), stored.target("conn_state")) == ("Connect Error", "4")

    @pytest.mark.parametrize("key, value", [("format_state", 1), ("format_state", 4), ("volume_state", 1)])
    def test_a_volume_that_fails_just_now_stays_failed(self, stored, box, key, value):
        box.remvol("--connect", "-n", "iqn.t1")
        box.run(["umount", "/mnt/VV/a"])
        self.read_as(box, f"{INITIATOR}/id:1/lun/id:1/{key}", value, then=3)
        status(box)
        assert (stored.lun(key), stored.lun("status")) == ("3", "Create Volume Failed")

    def test_a_killed_creation_of_a_volume_is_put_right(self, stored, box):
        box.hook("system", MOUNT, through=True, effect="kill -KILL $PPID", times=1)
        assert box.remvol("--connect", "-n", "iqn.t1").status == -9
        assert stored.lun("volume_state") == "1"
        status(box)
        assert (stored.lun("volume_state"), stored.lun("status")) == ("0", "No Format")

    @pytest.mark.parametrize("state", [1, 4])
    def test_a_killed_format_is_put_right(self, stored, box, state):
        stored.log_in("iqn.t1")
        box.tree.set({f"{INITIATOR}/id:1/lun/id:1/dev": "sdb", f"{INITIATOR}/id:1/lun/id:1/format_progress": 26})
        box.hook("ktreec_set", f"{INITIATOR}/id:1/lun/id:1/format_state", value=str(state), through=True,
                 effect="kill -KILL $PPID", times=1)
        assert box.remvol("--format", "-n", "iqn.t1", "-l", "0").status == -9
        box.tree.set(f"{INITIATOR}/id:1/lun/id:1/format_state", state)
        status(box)
        assert (stored.lun("format_state"), stored.lun("volume_state")) == ("0", "0")
        assert not stored.lun("status").startswith(("Formatting", "Wait", "Creating"))

    def test_a_format_whose_mke2fs_goes_on_stays_formatting(self, stored, box):
        stored.log_in("iqn.t1")
        box.tree.set(f"{INITIATOR}/id:1/lun/id:1/dev", "sdb")
        box.hook("ktreec_set", f"{INITIATOR}/id:1/lun/id:1/format_state", value="1", through=True,
                 effect="kill -KILL $PPID", times=1)
        assert box.remvol("--format", "-n", "iqn.t1", "-l", "0").status == -9
        box.tree.set(f"{INITIATOR}/id:1/lun/id:1/format_state", 1)
        program = box.start(["bash", "-c", "echo mke2fs >/proc/self/comm; sleep 30; true", "mke2fs", "/dev/sdb1"])
        until(lambda: any("mke2fs" in p.read_text() for p in box.path("/proc").glob("[0-9]*/comm")))
        status(box)
        program.kill()
        assert stored.lun("status").startswith("Formatting")


    def test_a_connection_that_failed_is_put_right_behind_the_counted_targets(self, site, box):
        site.store("iqn.t0", luns=[("a", 0)])
        assert box.remvol(*TestAdding.ADD).status == 255  # the share is in use: the target stays, uncounted
        site.refuse("iqn.t1")
        assert box.remvol("--connect", "-n", "iqn.t1").status == 255
        assert site.target("status", 2) == "Connecting"
        status(box)
        assert (site.target("status", 2), box.tree.get(f"{INITIATOR}/count")) == ("Connect Error", "1")

    def test_a_killed_connection_is_put_right_behind_the_counted_targets(self, site, box):
        site.store("iqn.t0", luns=[("a", 0)])
        box.remvol(*TestAdding.ADD)
        box.hook("popen", LOGIN, through=True, effect="kill -KILL $PPID", times=1)
        assert box.remvol("--connect", "-n", "iqn.t1").status == -9
        status(box)
        assert (site.target("status", 2), site.target("conn_state", 2)) == ("Disconnected", "0")

    def test_a_killed_format_is_put_right_behind_the_counted_targets(self, stored, box):
        stored.store("iqn.t2", slot=2, luns=[("b", 0, {"dev": "sdc", "volume_state": 3})])
        box.tree.set(f"{INITIATOR}/count", 1)
        stored.disk("sdc", fs="")
        stored.offer("iqn.t2", {0: "sdc"})
        stored.log_in("iqn.t2")
        box.hook("ktreec_set", f"{INITIATOR}/id:2/lun/id:1/status", value="Formatting 0%", through=True,
                 effect="kill -KILL $PPID", times=1)
        assert box.remvol("--format", "-n", "iqn.t2", "-l", "0").status == -9
        box.tree.set({f"{INITIATOR}/id:2/lun/id:1/status": "Formatting 0%", f"{INITIATOR}/id:2/lun/id:1/volume_state": 3})
        status(box)
        assert stored.lun("status", 1, 2) == "Create Volume Failed"

    def test_a_target_behind_the_counted_ones_that_shows_no_work_stays_as_it_is(self, stored, box):
        stored.store("iqn.t2", slot=2, status="Connected")
        box.tree.set(f"{INITIATOR}/count", 1)
        status(box)
        assert stored.target("status", 2) == "Connected"


class TestHalfMadeSlots:
    def test_a_share_that_could_not_be_read_once_costs_no_lun(self, stored, box):
        box.hook("ktreec_get_wb", f"{INITIATOR}/id:1/lun/id:1/share", ret=-1, times=2)
        status(box)
        assert (stored.lun("lun"), stored.lun("share")) == ("0", "a")

    def test_a_lun_without_a_share_is_gone_after_a_status(self, stored, box):
        box.tree.delete(f"{INITIATOR}/id:1/lun/id:1/share")
        assert f"half made slot '{INITIATOR}/id:1/lun/id:1' is deleted" in messages(status(box))
        assert stored.lun("lun") is None and stored.target("target") == "iqn.t1"

    def test_a_target_that_a_killed_add_has_not_counted_is_refreshed(self, site, box):
        site.store("iqn.t0")
        site.offer("iqn.t1", {0: "sdb"})
        box.hook("ktreec_set", f"{INITIATOR}/id:2/lun/id:1/enable", through=True, effect="kill -KILL $PPID", times=1)
        assert box.remvol(*TestAdding.ADD).status == -9
        assert box.tree.get(f"{INITIATOR}/count") == "1"
        status(box)
        assert (box.tree.get(f"{INITIATOR}/count"), site.target("status", 2)) == ("2", "Disconnected")

    @pytest.mark.parametrize("moment", ["id:1/lun/id:2/vol_access_right", "id:1/lun/count", "total_lun_count"])
    def test_a_further_lun_that_a_killed_add_has_not_counted_is_counted(self, stored, box, moment):
        box.hook("ktreec_set", f"{INITIATOR}/{moment}", effect="kill -KILL $PPID", times=1)
        assert box.remvol(*TestAdding.ADD[:4], "1", *TestAdding.ADD[5:-1], "b").status == -9
        assert stored.lun("share", 2) == "b"
        status(box)
        assert (stored.target("lun/count"), box.tree.get(f"{INITIATOR}/total_lun_count")) == ("2", "2")

    def test_a_count_of_luns_that_no_run_is_known_to_have_left_stays(self, stored, box):
        box.tree.delete(f"{INITIATOR}/id:1/lun/count")
        status(box)
        assert stored.target("lun/count") is None


class TestOneAfterAnother:
    def test_two_connections_of_a_target_follow_one_another(self, stored, box):
        box.hook("popen", LOGIN, through=True, delay=0.5, times=1)
        runs = [box.start(["remvol", "--connect", "-n", "iqn.t1"]) for _ in range(2)]
        assert [run.wait().status for run in runs] == [0, 0]
        assert (stored.target("status"), stored.lun("status")) == ("Connected", "Running")
        dumps = [n for n, line in enumerate(box.trace("popen", "dump")) if line.startswith("dump")]
        assert dumps == [1, 3]  # each logs in when the other has ended

    def test_a_target_that_is_taken_away_is_not_brought_up_meanwhile(self, stored, box):
        box.hook("popen", LOGIN, through=True, delay=0.5, times=1)
        connect = box.start(["remvol", "--connect", "-n", "iqn.t1"])
        until(lambda: any(call.kind == "popen" for call in box.calls))
        box.sleep_takes(100)
        assert box.remvol("--disconnect", "-n", "iqn.t1").status == 0
        assert connect.wait().status == 0
        assert not stored.mounted("a") and not stored.logged_in("iqn.t1")
        assert (stored.target("conn_set"), stored.target("conn_state")) == ("0", "0")

    def test_an_addition_that_waits_for_the_deletion_of_its_target_fails(self, stored, box):
        assert box.remvol("--connect", "-n", "iqn.t1").status == 0
        before = len(box.shell())
        meet(box, "system", 'iscsiadm -m node -T "iqn.t1" --logout')
        deletion = box.start(["remvol", "--del", "-n", "iqn.t1"])
        until(lambda: is_there(box))
        addition = box.start(["remvol", "--add", "-n", "iqn.t1", "-l", "1", "-i", "10.9.0.2", "-p", "3260", "-s", "b", "-c", "0"])
        until(lambda: stored.lun("enable", 2) == "1")
        go_on(box)
        assert deletion.wait().status == 0
        assert addition.wait().status == 255
        assert stored.target("target") is None
        assert not any("-o new" in line for line in box.shell()[before:])

    def test_settings_are_dumped_by_one_run_at_a_time(self, stored, box):
        box.hook("ktreec_dump", through=True, effect=held(box, "settings.lock"))
        status(box)
        assert box.path("/root/held").read_text() == "1\n"

    def test_the_flash_gets_one_copy_at_a_time(self, stored, box):
        box.fake("flashrun", effect=held(box, "flash.lock"))
        assert box.remvol("--disconnect", "-n", "iqn.t1").status == 0
        assert box.path("/root/held").read_text() == "1\n"


class TestAdding:
    ADD = ["--add", "-n", "iqn.t1", "-l", "0", "-i", "10.9.0.2", "-p", "3260", "-s", "a"]

    def test_storing_is_one_step_for_other_runs(self, site, box):
        site.offer("iqn.t1", {0: "sdb"})
        box.hook("ktreec_set", f"{INITIATOR}/id:1/lun/id:1/share", through=True, effect=held(box, "slots.lock"))
        assert box.remvol(*self.ADD).status == 0
        assert box.path("/root/held").read_text() == "1\n"

    @pytest.mark.parametrize("moment", ["target", "ip", "port", "lun/id:1/lun", "lun/id:1/share", "lun/id:1/enable"])
    def test_what_a_killed_run_began_is_completed(self, site, box, moment):
        site.offer("iqn.t1", {0: "sdb"})
        box.hook("ktreec_set", f"{INITIATOR}/id:1/{moment}", through=True, effect="kill -KILL $PPID", times=1)
        assert box.remvol(*self.ADD).status == -9
        second = box.remvol(*self.ADD)
        stored_whole = moment == "lun/id:1/enable"  # number and share are there: it is a LUN
        assert second.status == (255 if stored_whole else 0)
        assert (site.lun("lun"), site.lun("share")) == ("0", "a")
        assert site.lun("lun", 2) is None

    @pytest.mark.parametrize("command, sessions", [("^iscsiadm -m node .*-o new$", []), (MOUNT, ["iqn.t1"])],
                             ids=["before the login", "at the mount"])
    def test_what_a_killed_run_stored_is_counted(self, site, box, command, sessions):
        site.store("iqn.t0", luns=[("z", 0)])
        site.offer("iqn.t1", {0: "sdb"})
        site.disk("sdb")
        for name in sessions:
            site.log_in(name)
        box.hook("system", re.compile(command), through=True, effect="kill -KILL $PPID", times=1)
        assert box.remvol(*self.ADD).status == -9
        status(box)
        assert box.tree.get(f"{INITIATOR}/count") == "2"
        assert (site.target("status", 2), site.lun("status", 1, 2)) != (None, None)
        assert site.lun("volume_state", 1, 2) in (None, "0")

    def test_the_first_target_of_a_killed_run_is_counted(self, site, box):
        site.offer("iqn.t1", {0: "sdb"})
        box.hook("system", re.compile("^iscsiadm -m node .*-o new$"), effect="kill -KILL $PPID", times=1)
        assert box.remvol(*self.ADD).status == -9
        status(box)
        assert box.tree.get(f"{INITIATOR}/count") == "1"

    def test_a_target_whose_mount_failed_stays_uncounted(self, site, box):
        site.offer("iqn.t1", {0: "sdb"})
        site.disk("sdb")
        site.log_in("iqn.t1")
        box.hook("sys_get_partition_list", "/dev/sdb", ret=0, first=True)
        box.hook("sys_create_1_partition", "/dev/sdb", ret=1)
        assert box.remvol(*self.ADD).status == 255
        box.tree.set(f"{INITIATOR}/count", 0)
        status(box)
        assert (site.lun("volume_state"), box.tree.get(f"{INITIATOR}/count")) == ("3", "0")

    def test_a_target_whose_share_was_refused_stays_uncounted(self, site, box):
        site.store("iqn.t0", luns=[("a", 0)])
        assert box.remvol(*self.ADD).status == 255
        status(box)
        assert (site.target("target", 2), box.tree.get(f"{INITIATOR}/count")) == ("iqn.t1", "1")

    def test_two_at_once_with_one_share_name(self, site, box):
        site.offer("iqn.t1", {0: "sdb"})
        site.offer("iqn.t2", {0: "sdc"})
        other = [*self.ADD[:2], "iqn.t2", *self.ADD[3:]]
        runs = [box.start(["remvol", *args]) for args in (self.ADD, other)]
        assert sorted(run.wait().status for run in runs) == [0, 255]


    def test_a_lun_that_comes_while_the_last_one_is_deleted_stays(self, stored, box):
        stored.log_in("iqn.t1")
        meet(box, "system", 'iscsiadm -m node -T "iqn.t1" --logout')
        delete = box.start(["remvol", "--del_lun", "-n", "iqn.t1", "-l", "0"])
        until(lambda: is_there(box))
        add = box.start(["remvol", *self.ADD[:4], "1", *self.ADD[5:-1], "b"])
        until(lambda: stored.lun("enable", 2))
        go_on(box)
        assert (delete.wait().status, add.wait().status) == (0, 0)
        assert (stored.lun("lun"), stored.lun("share"), stored.target("lun/count")) == ("1", "b", "1")
        assert (box.tree.get(f"{INITIATOR}/count"), box.tree.get(f"{INITIATOR}/total_lun_count")) == ("1", "1")


class TestUpgrading:
    def test_it_is_one_step_for_other_runs(self, site, box):
        box.tree.set({f"{INITIATOR}/count": 1, f"{INITIATOR}/id:1/target": "iqn.t1", f"{INITIATOR}/id:1/ip": "10.9.0.2",
                      f"{INITIATOR}/id:1/share": "a"})
        box.hook("ktreec_set", f"{INITIATOR}/id:1/lun/id:1/lun", through=True, effect=held(box, "slots.lock"))
        assert box.remvol("--verupgrade").status == 0
        assert box.path("/root/held").read_text() == "1\n"
        assert site.lun("share") == "a"


class TestLunsThatMove:
    DELETE_FIRST = f"ktreec -S /var/run/ktree_sock_vv -d {INITIATOR}/id:1/lun/id:1"
    DELETE_AT_THIRD = f"{SLOTS_MOVE}; echo >>/root/reads; [ $(wc -l </root/reads) != 3 ] || {DELETE_FIRST}"

    @pytest.fixture
    def three(self, site, box):
        """A connected target with three LUNs; the first is deleted as soon as the second was found."""
        site.store("iqn.t1", conn_set=1, luns=[(share, n, {"dev": f"sd{share}"}) for n, share in enumerate("bcd")])
        site.offer("iqn.t1", {n: f"sd{share}" for n, share in enumerate("bcd")})
        site.log_in("iqn.t1")
        for share in "bcd":
            site.disk(f"sd{share}")
            site.mount(f"sd{share}", f"/mnt/VV/{share}")
        # The name is read when the target is found, when its LUN is found, and when the LUN is read.
        box.hook("ktreec_get_wb", f"{INITIATOR}/id:1/target", through=True, effect=self.DELETE_AT_THIRD)
        return site

    def test_the_lun_that_was_asked_for_is_deleted(self, three, box):
        assert box.remvol("--del_lun", "-n", "iqn.t1", "-l", "1").status == 0
        assert [three.lun("share", n) for n in (1, 2)] == ["d", None]
        assert (three.mounted("c"), three.mounted("d")) == (False, True)

    def test_the_lun_that_was_asked_for_is_formatted(self, three, box):
        for command in ("dd", "mke2fs"):
            box.fake(command)
        box.remvol("--format", "-n", "iqn.t1", "-l", "1")
        formatted = [line for line in box.shell() if "mke2fs" in line]
        assert formatted and all("/dev/sdc1" in line for line in formatted)
        assert three.mounted("d")


class TestTargetsThatMove:
    @pytest.mark.parametrize("function, subject, skip", [("system", re.compile("^iscsiadm -m session >"), 1),
                                                         ("sys_get_fs_type", "/dev/sdb1", 0)])
    def test_the_status_goes_to_the_target_it_is_of(self, site, box, function, subject, skip):
        """The first target is deleted while the second is refreshed: nothing is held then that a deletion waits for."""
        site.store("iqn.t1")
        site.store("iqn.t2", slot=2, luns=[("b", 0, {"mnt_dev": "/dev/sdb1"})])
        site.store("iqn.t3", slot=3)
        site.offer("iqn.t2", {0: "sdb"})
        site.log_in("iqn.t2")
        box.hook(function, subject, out="ext4", through=function == "system", effect="remvol --del -n iqn.t1", skip=skip,
                 times=1)
        site.disk("sdb")
        status(box)
        assert [site.target("target", n) for n in (1, 2, 3)] == ["iqn.t2", "iqn.t3", None]
        assert [site.target("status", n) for n in (1, 2)] == ["Connected", "Disconnected"]
        assert [site.lun(key) for key in ("dev", "status")] == ["sdb", "Offline"]
        assert [site.lun(key, target=2) for key in ("dev", "status")] == [None, None]


class TestAFurtherVolume:
    """Added to a target that is connected, and looked at meanwhile."""

    ADD = ["remvol", "--add", "-n", "iqn.t1", "-l", "1", "-i", "10.9.0.2", "-p", "3260", "-s", "b", "-c", "0"]

    @pytest.fixture
    def connected(self, stored, box):
        assert box.run(["/bin/mount", "-t", "tmpfs", "class", "/sys/class"], env={"LD_PRELOAD": None}).status == 0
        box.write("/sys/class/iscsi_session/session1/targetname", "iqn.t1\n")
        box.write("/sys/class/iscsi_session/session1/state", "LOGGED_IN\n")
        assert box.remvol("--connect", "-n", "iqn.t1").status == 0
        stored.offer("iqn.t1", {0: "sdb", 1: "sdc"})
        stored.disk("sdc")
        return stored

    @staticmethod
    def seen(box):
        told = json.loads(box.run(["vvstat", "--json", "b"], env={"LD_PRELOAD": None}).stdout)["volumes"]
        return [volume["problem"] for volume in told]

    @pytest.mark.parametrize("call", ["iscsiadm -m session >", "iscsiadm -m session -P3"])
    def test_it_has_not_failed_before_it_is_mounted(self, connected, box, call):
        meet(box, "system", re.compile("^" + call))
        run = box.start(self.ADD)
        until(lambda: is_there(box))
        assert self.seen(box) == ["is not mounted while a command works on its target"]
        go_on(box)
        assert run.wait().status == 0
        assert self.seen(box) == [None]

    def test_it_is_stored_while_another_run_has_the_target(self, connected, box):
        hold = "exec 9</run/remvol/target-*.lock; flock 9; echo held; exec sleep 1000"
        holder = box.start(["/bin/bash", "-c", hold], env={"LD_PRELOAD": None, "PATH": "/usr/bin:/bin"})
        box.wait_until(lambda: holder.stdout == "held\n")
        run = box.start(self.ADD)
        until(lambda: connected.lun("share", slot=2) == "b")
        assert not comes_true(lambda: connected.mounted("b"))
        holder.kill()
        assert run.wait().status == 0 and connected.mounted("b")

class TestASessionUnderAVolume:
    """A volume that the tree does not name is known by the kernel's tables alone."""

    @pytest.fixture
    def unknown(self, stored, box):
        stored.log_in("iqn.t1")
        box.session_disk("sdq", "iqn.t1", lun=7)
        stored.mount("sdq", "/mnt/VV/unknown")
        return stored

    @pytest.mark.parametrize("command, logout", [
        (["--disconnect", "-n", "iqn.t1"], 'iscsiadm -m node -T "iqn.t1" --logout'),
        (["--disconnect"], "iscsiadm -m node -u"),
        (["--system_off"], "iscsiadm -m node -u")])
    def test_it_is_unmounted_before_the_session_is_closed(self, unknown, box, command, logout):
        box.default("killall")
        box.remvol(*command)
        shell = box.shell()
        assert shell.index('umount -f "/mnt/VV/unknown"') < shell.index(logout)

    def test_a_disk_that_cannot_be_looked_at_may_be_the_sessions(self, unknown, box):
        done = box.run(["sh", "-c", "cd $(realpath /sys/block/sdq/device)/../../iscsi_session/session*/ && rm targetname && mkdir targetname"])
        assert done.status == 0, done.stderr
        said = messages(box.remvol("--disconnect", "-n", "iqn.t1"))
        assert "the session of /dev/sdq1 stays, it is in use at /mnt/VV/unknown" in said
        assert unknown.logged_in("iqn.t1") and unknown.mounted("unknown")

    @pytest.mark.parametrize("command", [["--disconnect", "-n", "iqn.t1"], ["--disconnect"]])
    def test_another_targets_volume_does_not_matter(self, stored, box, command):
        stored.log_in("iqn.t1")
        box.local_disk("sdq")
        stored.mount("sdq", "/mnt/VV/other")
        assert box.remvol(*command).status == 0
        assert stored.mounted("other")

    def test_a_search_closes_no_session_that_a_listing_did_not_show(self, unknown, box):
        box.fake("iscsiadm", "-m session", times=1)
        said = messages(box.remvol("--search_lun", "-n", "iqn.t1", "-c", "0", "-i", "10.9.0.2", "-p", "3260"))
        assert "the session of target iqn.t1 stays, a volume is mounted from it" in said
        assert unknown.logged_in("iqn.t1") and unknown.mounted("unknown")

    @pytest.mark.parametrize("ends, stays", [(False, True), (True, False)])
    def test_a_search_leaves_its_session_to_a_run_that_needs_it_still(self, stored, box, ends, stays):
        hold = "exec 9</run/remvol/target-*.lock; flock 9; echo held; exec sleep 1000"
        box.remvol("--disconnect", "-n", "iqn.t1")
        holder = box.start(["/bin/bash", "-c", hold], env={"LD_PRELOAD": None, "PATH": "/usr/bin:/bin"})
        box.wait_until(lambda: holder.stdout == "held\n")
        if ends:
            box.hook("popen", LOGIN, through=True, effect=f"kill -KILL {holder.pid}", times=1)
        assert box.remvol("--search_lun", "-n", "iqn.t1", "-c", "0", "-i", "10.9.0.2", "-p", "3260").status == 0
        assert stored.logged_in("iqn.t1") == stays

    def test_a_listing_that_fails_gives_no_session_up(self, unknown, box):
        box.fake("iscsiadm", "-m session -P3", status=1)
        said = messages(box.remvol("--connect", "-n", "iqn.t1"))
        assert "the session of target iqn.t1 stays, a volume is mounted from it" in said
        assert unknown.logged_in("iqn.t1") and unknown.target("conn_set") == "1"
        assert unknown.mounted("unknown")


class TestADiskThatSomebodyElseUses:
    """On one session a target of the settings, on another one somebody else's, whose disk is sdx."""

    DISKS = {"iqn.t1": "sdb", "iqn.theirs": "sdx", "iqn.gone": "sdq"}

    @pytest.fixture
    def theirs(self, stored, box):
        for folder in ("class", "dev"):
            assert box.run(["/bin/mount", "-t", "tmpfs", folder, f"/sys/{folder}"], env={"LD_PRELOAD": None}).status == 0
        box.default("killall")
        box.default("rmmod")
        stored.offer("iqn.theirs", {0: "sdx"})
        for name in ("iqn.t1", "iqn.theirs"):
            self.log_in(stored, box, name)
        return stored

    def log_in(self, stored, box, name):
        """A session that sysfs shows until it is closed."""
        number, disk = list(self.DISKS).index(name) + 1, self.DISKS[name]
        stored.log_in(name)
        box.session_disk(disk, name, session=number)
        box.write(f"/fake/initiator/on/{name}", name + "\n")
        folder = box.path(f"/sys/class/iscsi_session/session{number}")
        folder.mkdir(parents=True)
        folder.joinpath("targetname").symlink_to(f"/fake/initiator/on/{name}")
        for part in (disk, f"{disk}1"):
            box.path(f"/sys/class/block/{part}/holders").mkdir(parents=True)

    @staticmethod
    def hold(box, disk):
        """Something is built on it, such as LVM."""
        box.path(f"/sys/class/block/{disk}/holders/dm-0").mkdir()

    @staticmethod
    def said(disk, place):
        return f"the session of {disk} stays, it is in use at {place}"

    COMMANDS = [["--disconnect"], ["--system_off"], ["--deinit"]]

    @pytest.mark.parametrize("command", COMMANDS)
    def test_the_session_stays_while_it_is_mounted(self, theirs, box, command):
        theirs.mount("sdx", "/srv/theirs")
        done = box.remvol(*command)
        assert theirs.sessions() == ["iqn.theirs"]
        assert [line for line in messages(done) if "stays" in line] == [self.said("/dev/sdx1", "/srv/theirs")]
        assert "iscsiadm -m node -u" not in box.shell() and 'iscsiadm -m node -T "iqn.t1" --logout' in box.shell()
        assert done.status == 0

    @pytest.mark.parametrize("held", ["sdx", "sdx1"])
    def test_the_session_stays_while_something_is_built_on_it(self, theirs, box, held):
        self.hold(box, held)
        done = box.remvol("--disconnect")
        assert done.status == 0 and theirs.sessions() == ["iqn.theirs"]
        assert self.said(held, f"/sys/class/block/{held}/holders") in messages(done)

    def test_the_session_stays_while_it_is_mounted_by_another_name(self, theirs, box):
        by_path = "/dev/disk/by-path/ip-10.9.0.2:3260-iscsi-iqn.theirs-lun-0-part"
        theirs.mount(by_path.removeprefix("/dev/"), "/srv/theirs")
        device = box.path("/srv/theirs").stat().st_dev
        box.path("/sys/dev/block").mkdir()
        disk = "/fake/devices/platform/host3/session2/target3:0:0/3:0:0:0/block/sdx/sdx1"
        box.path(disk).mkdir(parents=True)
        box.path(f"/sys/dev/block/{os.major(device)}:{os.minor(device)}").symlink_to(disk)
        done = box.remvol("--disconnect")
        assert done.status == 0 and theirs.sessions() == ["iqn.theirs"]
        assert self.said(f"{by_path}1", "/srv/theirs") in messages(done)

    # What this run sees of it nowhere but in the kernel's answer.
    CLAIMS = {
        "mounted in another namespace": "mke2fs -q -t ext4 /dev/sdx && mkdir /srv/theirs && unshare -m mount /dev/sdx /srv/theirs && "
                                        "exec unshare -m sh -c 'mount /dev/sdx /srv/theirs; echo held; exec sleep 1000'",
        "swap": "mkswap /dev/sdx >/dev/null && swapon /dev/sdx && trap 'swapoff /dev/sdx; exit' TERM && echo held && "
                "while sleep 0.05; do :; done",
        "opened by one alone": """exec python3 -c "import os, time; disk = os.open('/dev/sdx', os.O_RDONLY | os.O_EXCL); """
                               """print('held', flush=True); time.sleep(1000)" mkfs.ext4 /dev/sdx""",
    }

    @pytest.fixture
    def real(self, theirs, box):
        """With a disk that the kernel knows."""
        box.disk("sdx", 16 << 20)
        box.write("/sys/class/block/sdx/device/state", "running\n")
        return theirs

    @staticmethod
    def claim(box, text):
        holder = box.start(["/bin/sh", "-c", text], env={"LD_PRELOAD": None, "PATH": "/usr/sbin:/usr/bin:/sbin:/bin"})
        box.wait_until(lambda: holder.stdout == "held\n" or holder.result is not None)
        assert holder.result is None, holder.result
        return holder

    @pytest.mark.parametrize("how", CLAIMS)
    def test_the_session_stays_while_the_kernel_says_that_it_is_in_use(self, real, box, how):
        holder = self.claim(box, self.CLAIMS[how])
        done = box.remvol("--disconnect")
        holder.kill(signal.SIGTERM)
        holder.wait()
        assert done.status == 0 and real.sessions() == ["iqn.theirs"]
        assert [line for line in messages(done) if "stays" in line] == [self.said("sdx", "/dev/sdx")]

    def test_a_disk_that_lost_its_target_is_not_opened(self, real, box):
        box.write("/sys/class/block/sdx/device/state", "blocked\n")
        holder = self.claim(box, self.CLAIMS["opened by one alone"])
        assert box.remvol("--disconnect").status == 0 and real.sessions() == []
        holder.kill()

    def test_whoever_formats_is_ended_with_the_session(self, real, box):
        rename = "open('/proc/self/comm', 'w').write('mke2fs'); print("
        holder = self.claim(box, self.CLAIMS["opened by one alone"].replace("print(", rename))
        assert box.remvol("--disconnect").status == 0 and real.sessions() == []
        assert "iscsiadm -m node -u" in box.shell()
        holder.kill()

    def test_a_disk_that_is_merely_open_is_not_in_use(self, real, box):
        holder = self.claim(box, "exec 9</dev/sdx; echo held; exec sleep 1000")
        assert box.remvol("--disconnect").status == 0 and real.sessions() == []
        holder.kill()

    @pytest.mark.parametrize("command", COMMANDS)
    def test_volumes_that_the_tree_does_not_name_are_unmounted_all_the_same(self, theirs, box, command):
        theirs.offer("iqn.gone", {0: "sdq"})
        self.log_in(theirs, box, "iqn.gone")
        theirs.mount("sdx", "/srv/theirs")
        theirs.mount("sdq", "/mnt/VV/gone")
        box.remvol(*command)
        mounts = box.run(["cat", "/proc/mounts"]).stdout
        assert "/mnt/VV/gone" not in mounts and "/srv/theirs" in mounts
        assert theirs.sessions() == ["iqn.theirs"]
        shell = box.shell()
        assert shell.index('umount -f "/mnt/VV/gone"') < shell.index('iscsiadm -m node -T "iqn.gone" --logout')

    def test_a_tree_that_is_silent_makes_no_difference(self, theirs, box):
        theirs.mount("sdx", "/srv/theirs")
        theirs.mount("sdb", "/mnt/VV/a")
        box.tree.stop()
        box.remvol("--system_off")
        assert "/mnt/VV/a" not in box.run(["cat", "/proc/mounts"]).stdout
        assert theirs.sessions() == ["iqn.theirs"]

    @pytest.fixture
    def two(self, theirs, box):
        """With a second target in the settings, which has no session."""
        theirs.store("iqn.gone", slot=2, conn_set=0)
        theirs.mount("sdx", "/srv/theirs")
        return theirs

    def test_a_logout_that_fails_counts_whichever_it_is(self, two, box):
        self.log_in(two, box, "iqn.gone")
        box.fake("iscsiadm", '-m node -T iqn.t1 --logout', status=1, first=True)
        done = box.remvol("--disconnect")
        assert (done.status, two.sessions()) == (255, ["iqn.t1", "iqn.theirs"])

    def test_a_target_without_a_session_is_no_failure(self, two, box):
        done = box.remvol("--disconnect")
        assert (done.status, two.sessions()) == (0, ["iqn.theirs"])
        assert "failed" not in done.stdout

    def test_without_another_session_nothing_is_closed(self, theirs, box):
        theirs.mount("sdx", "/srv/theirs")
        for _ in range(2):
            assert box.remvol("--disconnect").status == 0
        assert theirs.sessions() == ["iqn.theirs"]
        assert [line for line in box.shell() if "logout" in line or "-u" in line] == ['iscsiadm -m node -T "iqn.t1" --logout']

    # What others do with the disk of the target of the settings, and where a message says that it is.
    USES = pytest.mark.parametrize("use, said", [
        (lambda site, box: site.mount("sdb", "/srv/export"), ("/dev/sdb1", "/srv/export")),
        (lambda site, box: box.path("/sys/class/block/sdb1/holders/dm-0").mkdir(), ("sdb1", "/sys/class/block/sdb1/holders"))],
        ids=["mounted", "held"])

    @USES
    def test_the_session_of_a_target_of_the_settings_stays_as_well(self, theirs, box, use, said):
        use(theirs, box)
        done = box.remvol("--disconnect")
        assert (done.status, theirs.sessions()) == (255, ["iqn.t1"])
        assert [line for line in messages(done) if "stays" in line] == [self.said(*said)]
        assert 'iscsiadm -m node -T "iqn.theirs" --logout' in box.shell()

    FTP = ["/home/Public/a", "/home/Public/a b"]
    ONE = ["--disconnect", "-n", "iqn.t1"]

    @pytest.mark.parametrize("command", [*COMMANDS, ONE])
    @pytest.mark.parametrize("place", FTP)
    def test_a_second_mount_in_the_ftp_area_is_unmounted_before(self, theirs, box, command, place):
        theirs.mount("sdb", "/mnt/VV/a")
        theirs.mount("sdb", place)
        done = box.remvol(*command)
        assert "iqn.t1" not in theirs.sessions() and "stays" not in done.stdout
        assert place.split()[0] not in box.run(["cat", "/proc/mounts"]).stdout
        shell = box.shell()
        last = max(shell.index(f'umount -f "{path}"') for path in ("/mnt/VV/a", place))
        logout = 'iscsiadm -m node -T "iqn.t1" --logout' if command == self.ONE else "iscsiadm -m node -u"
        assert shell.index(f'fuser -mk "{place}"') < last < shell.index(logout)
        if command != ["--deinit"]:
            assert done.status == 0

    def assert_stays(self, site, box, done, said):
        """Its volume does not."""
        assert "iqn.t1" in site.sessions() and not any("logout" in line or "-u" in line for line in box.shell())
        assert [line for line in messages(done) if "stays" in line] == [self.said(*said)]
        assert box.shell().count('umount -f "/mnt/VV/a"') == 1

    @USES
    def test_the_session_of_one_target_stays_until_nobody_uses_it(self, theirs, box, use, said):
        theirs.mount("sdb", "/mnt/VV/a")
        use(theirs, box)
        done = box.remvol(*self.ONE)
        self.assert_stays(theirs, box, done, said)
        assert (done.status, theirs.target("conn_set"), theirs.target("status")) == (255, "0", "Connected")
        box.run(["sh", "-c", "umount /srv/export; rmdir /sys/class/block/sdb1/holders/dm-0"])
        assert box.remvol(*self.ONE).status == 0
        assert (theirs.sessions(), theirs.target("status")) == (["iqn.theirs"], "Disconnected")

    @pytest.mark.parametrize("how", CLAIMS)
    def test_the_session_of_one_target_stays_while_the_kernel_says_that_it_is_in_use(self, real, box, how):
        real.store("iqn.theirs", slot=2, luns=[("b", 0)])
        holder = self.claim(box, self.CLAIMS[how])
        done = box.remvol("--disconnect", "-n", "iqn.theirs")
        holder.kill(signal.SIGTERM)
        holder.wait()
        assert "iqn.theirs" in real.sessions() and self.said("sdx", "/dev/sdx") in messages(done)

    @USES
    def test_a_target_that_is_deleted_leaves_its_session_to_whoever_uses_it(self, theirs, box, use, said):
        theirs.mount("sdb", "/mnt/VV/a")
        use(theirs, box)
        box.fake("iscsiadm", re.compile("-T iqn.t1 .*-o delete$"), status=15, first=True)
        done = box.remvol("--del", "-n", "iqn.t1")
        self.assert_stays(theirs, box, done, said)
        assert (done.status, theirs.target("target")) == (0, None)
        box.run(["sh", "-c", "umount /srv/export; rmdir /sys/class/block/sdb1/holders/dm-0"])
        assert box.remvol("--disconnect").status == 0 and theirs.sessions() == []

    @USES
    def test_a_target_that_is_modified_is_mounted_again_from_its_session(self, theirs, box, use, said):
        theirs.tree.set(f"{INITIATOR}/id:1/conn_set", 1)
        theirs.mount("sdb", "/mnt/VV/a")
        use(theirs, box)
        done = box.remvol("--modify", "-n", "iqn.t1", "-c", "1", "-U", "user", "-P", "a long secret")
        self.assert_stays(theirs, box, done, said)
        assert (done.status, theirs.target("chap_name"), theirs.target("conn_set")) == (0, "user", "1")
        assert theirs.mounted("a") and theirs.target("status") == "Connected"

    @pytest.mark.parametrize("command", [["--disconnect"], ONE])
    def test_a_mount_in_the_ftp_area_that_stays_keeps_the_session(self, theirs, box, command):
        theirs.mount("sdb", self.FTP[0])
        box.fake("umount", f"-f {self.FTP[0]}", status=32, first=True)
        done = box.remvol(*command)
        # That of another target, which nobody uses, does not.
        assert (done.status, theirs.sessions()) == (255, ["iqn.t1", "iqn.theirs"] if command == self.ONE else ["iqn.t1"])
        assert self.said("/dev/sdb1", self.FTP[0]) in messages(done)

    @pytest.mark.parametrize("command", [ONE, ["--del", "-n", "iqn.t1"], ["--modify", "-n", "iqn.t1", "-c", "0", "-U", "u", "-P", "p"]],
                             ids=lambda command: command[0])
    def test_a_mount_in_the_ftp_area_is_unmounted_with_patience(self, theirs, box, command):
        theirs.mount("sdb", "/mnt/VV/a")
        theirs.mount("sdb", self.FTP[0])
        box.fake("umount", f"-f {self.FTP[0]}", status=32, first=True, times=3)
        box.fake("iscsiadm", re.compile("-T iqn.t1 .*-o delete$"), status=0, first=True)
        done = box.remvol(*command)
        assert (done.status, theirs.sessions()) == (0, ["iqn.theirs"])
        assert self.FTP[0] not in box.run(["cat", "/proc/mounts"]).stdout and "stays" not in done.stdout

    def test_another_targets_mount_in_the_ftp_area_stays(self, theirs, box):
        theirs.mount("sdx", self.FTP[0])
        box.remvol(*self.ONE)
        assert theirs.sessions() == ["iqn.theirs"] and self.FTP[0] in box.run(["cat", "/proc/mounts"]).stdout

    def test_what_comes_into_use_while_volumes_are_unmounted_stays(self, theirs, box):
        theirs.mount("sdb", "/mnt/VV/unknown")
        box.fake("fuser", "-mk /mnt/VV/unknown", first=True, effect="mkdir -p /sys/class/block/sdx1/holders/dm-0")
        assert box.remvol("--disconnect").status == 0
        assert theirs.sessions() == ["iqn.theirs"]

    def test_a_volume_that_stays_mounted_keeps_all(self, theirs, box):
        theirs.mount("sdx", "/srv/theirs")
        theirs.mount("sdb", f"/mnt/VV/{'long' * 50}")  # as no share is called
        assert box.remvol("--disconnect").status == 255
        assert theirs.sessions() == ["iqn.t1", "iqn.theirs"]

    @pytest.mark.parametrize("command", COMMANDS)
    def test_one_that_nobody_uses_is_closed_like_all(self, theirs, box, command):
        box.local_disk("sdl")
        box.path("/sys/class/block/sdl/holders/dm-0").mkdir(parents=True)
        theirs.mount("sdl", "/srv/local")
        box.remvol(*command)
        assert theirs.sessions() == [] and "iscsiadm -m node -u" in box.shell()


class TestTakingEverythingAway:
    """It holds no target: what it closes and removes, another run may bring up in the same moment."""

    @pytest.mark.parametrize("command", ["--disconnect", "--deinit", "--system_off"])
    def test_nothing_is_mounted_while_the_sessions_are_closed(self, stored, box, command):
        box.default("killall")
        box.default("rmmod")
        stored.log_in("iqn.t1")
        meet(box, "system", "iscsiadm -m node -u")
        everything = box.start(["remvol", command])
        until(lambda: is_there(box))
        connect = box.start(["remvol", "--connect", "-n", "iqn.t1"])
        mounted = comes_true(lambda: stored.mounted("a"))
        go_on(box)
        everything.wait()
        connect.wait()
        assert not mounted

    def test_nothing_is_mounted_where_a_mount_point_is_removed(self, stored, box):
        stored.log_in("iqn.t1")
        stored.mount("sdb", "/mnt/VV/a")
        meet(box, "system", 'rm -rf "/mnt/VV/a"')
        everything = box.start(["remvol", "--disconnect"])
        until(lambda: is_there(box))
        connect = box.start(["remvol", "--connect", "-n", "iqn.t1"])
        mounted = comes_true(lambda: stored.mounted("a"))
        go_on(box)
        everything.wait()
        connect.wait()
        assert not mounted

    @pytest.fixture
    def another(self, stored):
        """Makes a second target, logged in, whose share has the name."""
        def make(share):
            stored.store("iqn.t2", slot=2, conn_set=0, luns=[(share, 0)])
            stored.offer("iqn.t2", {0: "sdc"})
            stored.disk("sdc")
            stored.log_in("iqn.t2")
        return make

    @pytest.mark.parametrize("removed, share", [("a", "a/b"), ("a/b", "a"), ("a", "./a"), ("a", "a/"), ("./a", "/.//a/b")])
    def test_nothing_is_mounted_above_or_below_a_mount_point_that_is_removed(self, stored, box, another, removed, share):
        another(share)
        box.tree.set(f"{INITIATOR}/id:1/lun/id:1/share", removed)
        stored.log_in("iqn.t1")
        box.path(f"/mnt/VV/{removed}").mkdir(parents=True)
        meet(box, "system", f'rm -rf "/mnt/VV/{removed}"')
        disconnect = box.start(["remvol", "--disconnect", "-n", "iqn.t1"])
        until(lambda: is_there(box))
        connect = box.start(["remvol", "--connect", "-n", "iqn.t2"])
        mounted = comes_true(lambda: stored.mounted(posixpath.normpath(share.lstrip("/"))))
        go_on(box)
        assert (disconnect.wait().status, connect.wait().status) == (0, 0)
        assert not mounted and stored.mounted(posixpath.normpath(share.lstrip("/")))

    @pytest.mark.parametrize("share", ["b", "ab", ".a"])
    def test_a_mount_elsewhere_does_not_wait_for_a_removal(self, stored, box, another, share):
        another(share)
        stored.log_in("iqn.t1")
        box.path("/mnt/VV/a").mkdir(parents=True)
        meet(box, "system", 'rm -rf "/mnt/VV/a"')
        disconnect = box.start(["remvol", "--disconnect", "-n", "iqn.t1"])
        until(lambda: is_there(box))
        assert box.remvol("--connect", "-n", "iqn.t2").status == 0
        assert stored.mounted(share)
        go_on(box)
        disconnect.wait()

    def test_nothing_is_mounted_beside_a_removal_that_does_not_end(self, stored, box, another):
        another("a/b")
        stored.log_in("iqn.t1")
        box.path("/mnt/VV/a").mkdir(parents=True)
        meet(box, "system", 'rm -rf "/mnt/VV/a"')
        disconnect = box.start(["remvol", "--disconnect", "-n", "iqn.t1"])
        until(lambda: is_there(box))
        box.sleep_takes(0)
        said = messages(box.remvol("--connect", "-n", "iqn.t2"), "Target_mount")
        assert said == ["/mnt/VV/a/b is neither made nor removed, another run is at work there"]
        assert not any(line.startswith("mkdir") for line in box.shell())
        go_on(box)
        disconnect.wait()

    def test_nothing_is_removed_beside_a_mount_that_does_not_end(self, stored, box):
        stored.log_in("iqn.t1")
        meet(box, "system", MOUNT)
        connect = box.start(["remvol", "--connect", "-n", "iqn.t1"])
        until(lambda: is_there(box))
        box.sleep_takes(0)
        said = messages(box.remvol("--disconnect"), "Target_LUN_umount")
        assert said == ["/mnt/VV/a is neither made nor removed, another run is at work there"]
        assert box.path("/mnt/VV/a").is_dir()
        go_on(box)
        connect.wait()

    @pytest.mark.parametrize("function, what", [
        ("sys_create_1_partition", "/dev/sdb"), ("system", "fuser -mk /dev/sdb1"),
        ("system", 'fuser -mk "/dev/sdb1"'), ("system", "dd if=/dev/zero of=/dev/sdb1 bs=1M count=1"),
        ("popen", re.compile("mke2fs.* /dev/sdb1$")), ("system", MOUNT)])
    def test_no_session_is_closed_between_the_look_at_its_disk_and_what_is_done_to_it(self, stored, box, function, what):
        stored.log_in("iqn.t1")
        box.tree.set({f"{INITIATOR}/id:1/lun/id:1/dev": "sdb", f"{INITIATOR}/id:1/lun/id:1/mnt_dev": "/dev/sdb1"})
        box.hook("sys_get_partition_list", "/dev/sdb", ret=0, times=1, first=True)
        meet(box, function, what)
        box.hook("sys_create_1_partition", "/dev/sdb")
        box.fake("dd")
        box.fake("mke2fs")
        format_ = box.start(["remvol", "--format", "-n", "iqn.t1", "-l", "0"])
        until(lambda: is_there(box))
        everything = box.start(["remvol", "--disconnect"])
        closed = comes_true(lambda: not stored.logged_in("iqn.t1"))
        go_on(box)
        format_.wait()
        everything.wait()
        assert not closed and not stored.logged_in("iqn.t1")

    def test_no_target_is_logged_in_while_the_users_of_a_name_that_is_nobodys_are_ended(self, stored, box):
        box.tree.set(f"{INITIATOR}/id:1/lun/id:1/mnt_dev", "/dev/sdb1")
        stored.store("iqn.t2", slot=2)
        stored.offer("iqn.t2", {0: "sdb"})  # the lowest name that is free
        meet(box, "system", "fuser -mk /dev/sdb1")
        disconnect = box.start(["remvol", "--disconnect", "-n", "iqn.t1"])
        until(lambda: is_there(box))
        connect = box.start(["remvol", "--connect", "-n", "iqn.t2"])
        came = comes_true(lambda: stored.logged_in("iqn.t2"))
        go_on(box)
        disconnect.wait()
        connect.wait()
        assert not came

    def test_the_users_of_a_name_that_is_nobodys_are_ended_when_a_login_has_ended(self, stored, box):
        box.tree.set(f"{INITIATOR}/id:1/lun/id:1/mnt_dev", "/dev/sdb1")
        stored.store("iqn.t2", slot=2)
        stored.offer("iqn.t2", {0: "sdb"})
        meet(box, "popen", re.compile("^iscsiadm -m node -T iqn.t2 .*--login$"))
        connect = box.start(["remvol", "--connect", "-n", "iqn.t2"])
        until(lambda: is_there(box))
        disconnect = box.start(["remvol", "--disconnect", "-n", "iqn.t1"])
        ended = comes_true(lambda: "fuser -mk /dev/sdb1" in box.shell())
        box.session_disk("sdb", "iqn.t2")
        go_on(box)
        connect.wait()
        assert "/dev/sdb1 is not the disk of LUN 0 of iqn.t1, it is left alone" in messages(disconnect.wait())
        assert not ended and "fuser -mk /dev/sdb1" not in box.shell()

    def test_a_session_is_closed_beside_another_targets_work(self, stored, box):
        stored.log_in("iqn.t1")
        stored.store("iqn.t2", slot=2, luns=[("b", 0)])
        stored.offer("iqn.t2", {0: "sdc"})
        stored.disk("sdc")
        meet(box, "system", re.compile("^mount -t ext4 /dev/sdb1 "))
        connect = box.start(["remvol", "--connect", "-n", "iqn.t1"])
        until(lambda: is_there(box))
        assert box.remvol("--connect", "-n", "iqn.t2").status == 0
        assert box.remvol("--disconnect", "-n", "iqn.t2").status == 0
        go_on(box)
        assert connect.wait().status == 0


class TestATreeThatIsStartedAnew:
    def test_an_add_whose_tree_has_gone_is_no_success(self, site, box):
        site.offer("iqn.t1", {0: "sdb"})
        box.tree.set(f"{INITIATOR}/ver", 1)
        # As its unit does: the daemon is killed, and one that has loaded what was saved before takes its place.
        restart = ("kill -KILL $(cat /var/run/ktree_sock_vv_config.pid); sleep 0.1; "
                   "ktree -n config -s /var/run/ktree_sock_vv >/dev/null 2>&1 & sleep 0.3; "
                   f"ktreec -S /var/run/ktree_sock_vv -s {INITIATOR}/ver 1")
        box.hook("ktreec_set", "/result/add", value="0", through=True, effect=restart, times=1)
        done = box.remvol(*TestAdding.ADD)
        assert done.status == 255
        assert box.tree.get("/result/add") == "-1"
        assert "the configuration tree was started anew meanwhile, what was changed may be lost" in messages(done)

    def test_a_volume_that_was_lost_at_the_very_end_is_taken_away(self, site, box):
        site.offer("iqn.t1", {0: "sdb"})
        site.log_in("iqn.t1")
        site.disk("sdb")
        box.session_disk("sdb", "iqn.t1")
        box.tree.set(f"{INITIATOR}/ver", 1)
        restart = ("kill -KILL $(cat /var/run/ktree_sock_vv_config.pid); sleep 0.1; "
                   "ktree -n config -s /var/run/ktree_sock_vv >/dev/null 2>&1 & sleep 0.3")
        box.hook("ktreec_set", "/result/add", value="0", through=True, effect=restart, times=1)
        box.hook("usleep", "100000", skip=3, times=1, through=True,
                 effect=f"ktreec -S /var/run/ktree_sock_vv -s {INITIATOR}/ver 1")
        assert box.remvol(*TestAdding.ADD).status == 255
        shell = box.shell()
        assert shell.index('umount -f "/mnt/VV/a"') < len(shell) - shell[::-1].index(SHARES) - 1
        assert "/mnt/VV/a" not in box.run(["cat", "/proc/mounts"]).stdout

    def test_a_volume_that_the_new_tree_knows_stays(self, site, box):
        site.offer("iqn.t1", {0: "sdb", 1: "sdc"})
        site.log_in("iqn.t1")
        for lun, disk in enumerate(["sdb", "sdc"]):
            site.disk(disk)
            box.session_disk(disk, "iqn.t1", lun=lun)
        box.path("/etc/NAS_CFG").mkdir(parents=True)
        box.tree.set(f"{INITIATOR}/ver", 1)
        assert box.remvol(*TestAdding.ADD).status == 0
        restart = ("kill -KILL $(cat /var/run/ktree_sock_vv_config.pid); sleep 0.1; "
                   "ktree -n config -s /var/run/ktree_sock_vv -l /etc/NAS_CFG/vv.xml >/dev/null 2>&1 & sleep 0.3")
        box.hook("ktreec_set", "/result/add", value="0", through=True, effect=restart, times=1)
        assert box.remvol("--add", "-n", "iqn.t1", "-i", "10.0.0.1", "-p", "3260", "-l", "1", "-s", "b").status == 255
        mounts = box.run(["cat", "/proc/mounts"]).stdout
        assert "/mnt/VV/a" in mounts and "/mnt/VV/b" not in mounts

    # A new tree that has a count, which any run stores there, and not the settings of the file.
    ANEW = ("kill -KILL $(cat /var/run/ktree_sock_vv_config.pid); "
            "until ktreec -S /var/run/ktree_sock_vv -t >/dev/null 2>&1; [ $? -eq 3 ]; do sleep 0.01; done; "
            "ktree -n config -s /var/run/ktree_sock_vv >/dev/null 2>&1 & "
            f"until ktreec -S /var/run/ktree_sock_vv -s {INITIATOR}/count 1; do sleep 0.01; done")

    @staticmethod
    def save(box):
        box.path("/etc/NAS_CFG").mkdir(parents=True, exist_ok=True)
        box.run(["sh", "-c", f"ktreec -S /var/run/ktree_sock_vv -s {INITIATOR}/ver 1; "
                             "ktreec -S /var/run/ktree_sock_vv -D /etc/NAS_CFG/vv.xml"])

    def test_a_target_that_is_loaded_between_two_looks_keeps_its_session(self, stored, box):
        self.save(box)
        box.hook("system", SHARES, through=True, effect=f"{self.ANEW}; touch /root/anew", times=1)
        box.hook("ktreec_get_wb", f"{INITIATOR}/ver", through=True,
                 effect="[ ! -e /root/anew ] || ktreec -S /var/run/ktree_sock_vv -l /etc/NAS_CFG/vv.xml")
        box.remvol("--connect", "-n", "iqn.t1")
        assert box.path("/root/anew").exists() and stored.logged_in("iqn.t1")

    @pytest.fixture
    def offered(self, site, box):
        site.offer("iqn.t1", {0: "sdb"})
        site.log_in("iqn.t1")
        site.disk("sdb")
        box.session_disk("sdb", "iqn.t1")
        self.save(box)

    def test_a_new_tree_that_was_not_loaded_tells_nothing_of_volumes(self, offered, box):
        box.hook("ktreec_set", "/result/add", value="0", through=True, effect=self.ANEW, times=1)
        assert box.remvol(*TestAdding.ADD).status == 255
        assert "/mnt/VV/a" in box.run(["cat", "/proc/mounts"]).stdout
        assert box.tree.get(f"{INITIATOR}/count") == "1"

    def test_a_new_tree_that_is_loaded_later_is_waited_for_although_it_has_a_count(self, offered, box):
        box.hook("ktreec_set", "/result/add", value="0", through=True, effect=self.ANEW, times=1)
        box.hook("usleep", "100000", skip=3, times=1, through=True,
                 effect=f"ktreec -S /var/run/ktree_sock_vv -s {INITIATOR}/ver 1")
        assert box.remvol(*TestAdding.ADD).status == 255
        assert "/mnt/VV/a" not in box.run(["cat", "/proc/mounts"]).stdout

    def test_a_connection_is_not_closed_by_a_new_tree_that_was_not_loaded(self, offered, site, box):
        site.store("iqn.t1", ip="10.0.0.1", port=3260, luns=[("a", 0)])
        self.save(box)
        box.hook("system", re.compile("^chmod 777 "), through=True, effect=self.ANEW, times=1)
        box.remvol("--connect", "-n", "iqn.t1")
        assert "/mnt/VV/a" in box.run(["cat", "/proc/mounts"]).stdout
        assert box.tree.get(f"{INITIATOR}/count") == "1"

    def test_an_add_whose_tree_does_not_answer_is_no_success(self, site, box):
        site.offer("iqn.t1", {0: "sdb"})
        box.hook("ktreec_set", "/result/add", value="0", through=True, times=1,
                 effect="kill -KILL $(cat /var/run/ktree_sock_vv_config.pid)")
        assert box.remvol(*TestAdding.ADD).status == 255


    def test_an_added_volume_that_the_new_tree_does_not_know_is_taken_away(self, site, box):
        site.offer("iqn.t1", {0: "sdb"})
        site.log_in("iqn.t1")
        site.disk("sdb")
        box.tree.set(f"{INITIATOR}/ver", 1)
        restart = ("kill -KILL $(cat /var/run/ktree_sock_vv_config.pid); sleep 0.1; "
                   "ktree -n config -s /var/run/ktree_sock_vv >/dev/null 2>&1 & sleep 0.3")
        box.hook("system", re.compile("^chmod 777 "), through=True, effect=restart, times=1)
        box.hook("usleep", "100000", skip=3, times=1, through=True,
                 effect=f"ktreec -S /var/run/ktree_sock_vv -s {INITIATOR}/ver 1")
        done = box.remvol(*TestAdding.ADD)
        assert done.status == 255
        assert any("mount -t ext4" in line for line in box.shell())
        assert "/mnt/VV/a" not in box.run(["cat", "/proc/mounts"]).stdout

    def test_a_volume_whose_tree_does_not_come_back_stays(self, site, box):
        site.offer("iqn.t1", {0: "sdb"})
        site.log_in("iqn.t1")
        site.disk("sdb")
        box.hook("system", re.compile("^chmod 777 "), through=True, times=1,
                 effect="kill -KILL $(cat /var/run/ktree_sock_vv_config.pid); "
                 "until ktreec -S /var/run/ktree_sock_vv -t >/dev/null 2>&1; [ $? -eq 3 ]; do sleep 0.01; done")
        assert box.remvol(*TestAdding.ADD).status == 255
        assert box.trace("usleep").count("usleep 100000") == 50
        assert "/mnt/VV/a" in box.run(["cat", "/proc/mounts"]).stdout


class TestStrangersAndTemporaryFiles:
    def test_a_run_beside_another_lists_into_a_file_of_its_own(self, stored, box):
        box.fake("iscsiadm", "-m session", exact=True, delay=1, times=1, status=21)
        first = box.start(["remvol", "--status"])
        until(lambda: box.runs("iscsiadm"))
        until(lambda: any("-m session >" in line for line in box.shell()))
        status(box)
        first.wait()
        files = {line.split(">")[1].split()[0] for line in box.shell() if line.startswith("iscsiadm -m session >")}
        assert "/tmp/remvol_session.tmp" in files and len(files) == 2
        assert not [p.name for p in box.path("/tmp").iterdir() if re.search(r"\.tmp\.\d", p.name)]

    def test_a_lock_folder_of_another_user_is_replaced(self, stored, box):
        folder = box.path("/var/lock/virtual_volume")
        folder.mkdir(parents=True)
        box.run(["sh", "-c", "chown 1234 /var/lock/virtual_volume; ln -s /root/victim /var/lock/virtual_volume/remvol_recover.lock"])
        box.tree.set({f"{INITIATOR}/id:1/conn_set": 1, f"{INITIATOR}/id:1/conn_state": 3})
        box.remvol("--oiscsi_evt_recover", "-n", "iqn.t1")
        assert not box.path("/root/victim").exists()
        assert folder.stat().st_uid == 0 and folder.stat().st_mode & 0o777 == 0o700

    def test_an_error_of_a_lock_that_stays_ends_the_tries(self, stored, box):
        box.tree.set({f"{INITIATOR}/id:1/conn_set": 1, f"{INITIATOR}/id:1/conn_state": 3})
        box.hook("fcntl", "lock", ret=-1, errno=37)
        done = box.remvol("--oiscsi_evt_recover", "-n", "iqn.t1")
        assert done.status == 255
        assert "lock failed for iqn.t1, skip and exit" in messages(done)
        assert len(box.trace("fcntl")) < 200
