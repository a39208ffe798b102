"""remvol-keeper: what should be connected or mounted and is not is tried again; the initiator's daemon is there."""

import shutil
import signal
import subprocess

import pytest
from harness.initiator import store

pytestmark = pytest.mark.long
SESSIONS = "/sys/class/iscsi_session"
VOLUME = "/iscsi/initiator/id:1/lun/id:{}"
SET = "{}/bin/ktreec -S /var/run/ktree_sock_vv -s /iscsi/initiator/id:1"
CONNECT = ("--connect", "-n", "iqn.t1")


class Keeper:
    """A box with sessions in its sysfs, targets in its tree, and a keeper that runs."""

    def __init__(self, box):
        self.box = box
        done = box.run(["/bin/mount", "-t", "tmpfs", "class", "/sys/class"], env={"LD_PRELOAD": None})
        assert done.status == 0, done.stderr
        box.path(SESSIONS).mkdir()
        box.default("remvol")
        box.default("iscsid")
        self.daemon = None

    def target(self, number, port=1, state=4, wanted=1):
        store(self.box, f"iqn.t{number}", slot=number, ip="127.0.0.1", port=port, conn_state=state, conn_set=wanted)

    def session(self, number):
        self.box.write(f"{SESSIONS}/session{number}/targetname", f"iqn.t{number}\n")
        self.box.write(f"{SESSIONS}/session{number}/state", "LOGGED_IN\n")

    def start(self, *under):
        env = {"LD_PRELOAD": f"{self.box.tools}/libnetlink.so:{self.box.tools}/libpreload.so"}
        self.daemon = self.box.start([*under, self.box.build / "bin/remvol-keeper"], env=env)

    def wait_runs(self, *expected):
        self.box.wait_until(lambda: len(self.runs) >= len(expected), what=f"{expected}, ran {self.runs}")
        assert self.runs[:len(expected)] == list(expected)

    @property
    def runs(self):
        return [tuple(call) for call in self.box.runs("remvol")]


def lives(box, name, *words, seconds=1000, under=()):
    """A process of that name that takes its time; returns when it is seen."""
    program = f"/tmp/bin/{name}"
    box.write(program, f"#!/bin/sh\nsleep {seconds}\n").chmod(0o755)
    run = box.start([*under, program, *words], env={"LD_PRELOAD": None})
    box.wait_until(lambda: ["/bin/sh", program, *words] in box.processes().values(), what=name)
    return run


def at_work(box, *words, **how):
    return lives(box, "remvol", *words, **how)


@pytest.fixture
def keeper(box):
    keeper = Keeper(box)
    yield keeper
    if keeper.daemon is not None:
        keeper.daemon.kill(signal.SIGTERM)
        assert keeper.daemon.wait().status == 0


def listen(box):
    """From now on somebody accepts connections in the box's network."""
    box.start(["/usr/bin/python3", "-c", "import socket,time\ns=socket.create_server(('127.0.0.1',3260))\ntime.sleep(1000)"],
              env={"LD_PRELOAD": None})


def test_a_wanted_target_is_connected_when_its_portal_answers(keeper):
    box = keeper.box
    keeper.target(1, port=3260)
    keeper.start()
    keeper.wait_runs(("--status",))
    assert keeper.runs == [("--status",)]
    listen(box)
    keeper.wait_runs(("--status",), ("--connect", "-n", "iqn.t1"))


def test_a_starter_that_ignores_the_end_of_its_children_makes_no_difference(keeper):
    keeper.target(1, port=3260)
    listen(keeper.box)
    keeper.start()
    keeper.wait_runs(("--status",), ("--connect", "-n", "iqn.t1"), ("--connect", "-n", "iqn.t1"))


@pytest.mark.parametrize("values", [{"wanted": 0}, {"state": 0}], ids=["not wanted", "taken away"])
def test_a_target_that_is_to_be_away_is_left_away(keeper, values):
    keeper.target(1, **values)
    keeper.target(2)
    keeper.session(2)
    keeper.start()
    keeper.box.run(["/bin/sleep", "6"], env={"LD_PRELOAD": None})
    assert keeper.runs == []


def test_a_target_that_was_never_connected_is_left_away(keeper):
    """As it is between its addition and its first connection."""
    listen(keeper.box)
    keeper.start()
    wait(keeper.box, 3)
    keeper.target(1, port=3260, wanted=None, state=None)
    wait(keeper.box, 6)
    assert keeper.runs == [] and "iqn.t1" not in keeper.daemon.stderr


@pytest.mark.parametrize("named", ["-n iqn.t2", "-n iqn.t1", ""], ids=["another", "itself", "all"])
def test_only_a_command_for_the_target_keeps_it_away(keeper, named):
    box = keeper.box
    run = at_work(box, "--disconnect", *named.split())
    keeper.target(1, port=3260)
    listen(box)
    keeper.start()
    if "t2" in named:
        keeper.wait_runs(("--status",), ("--connect", "-n", "iqn.t1"))
    else:
        box.run(["/bin/sleep", "6"], env={"LD_PRELOAD": None})
        assert run.result is None and keeper.runs == []


@pytest.mark.parametrize("meanwhile", [
    SET.format("{build}") + "/conn_set 0",
    "mkdir -p {session}; echo iqn.t1 >{session}/targetname",
], ids=["disconnected", "connected"])
def test_what_happens_to_a_target_during_a_try_holds(keeper, meanwhile):
    box = keeper.box
    keeper.target(1, port=3260)
    listen(box)
    box.fake("remvol", "--status", effect=meanwhile.format(build=box.build, session=f"{SESSIONS}/session1"), times=1)
    keeper.start()
    keeper.wait_runs(("--status",))
    wait(box, 5)
    assert keeper.runs == [("--status",)]


def gives_up(box, state, more=":", before=":"):
    """What the tool stores, and says, when a session shows no disk."""
    store = SET.format(box.build)
    return (f"{store}/conn_set 1; {before}; {store}/conn_set 0; {store}/conn_state 0; {store}/lun/id:1/volume_state {state}; "
            f"{more}; exit 255")


def wish(box):
    return [box.tree.get(f"/iscsi/initiator/id:1/{key}") for key in ("conn_set", "conn_state", "lun/id:1/volume_state")]


def test_a_target_whose_disks_are_late_is_tried_until_they_are_there(keeper):
    """Its portal answers before its LUNs are there, as when storage comes up after a power failure."""
    box = keeper.box
    keeper.target(1, port=3260)
    listen(box)
    session = f"mkdir {SESSIONS}/session1; echo iqn.t1 >{SESSIONS}/session1/targetname; sleep 3; rm -r {SESSIONS}/session1"
    box.fake("remvol", "--connect", effect=gives_up(box, 3, before=session), status=255)
    keeper.start()
    keeper.wait_runs(("--status",), CONNECT, CONNECT, CONNECT)
    box.wait_until(lambda: wish(box) == ["1", "4", "2"], what="the wish")
    assert keeper.daemon.stderr.count("iqn.t1") == 1  # that it is missing


def connected(keeper):
    """A target that is connected, and that the keeper has seen."""
    keeper.target(1, port=3260, state=1)
    keeper.session(1)
    keeper.start()
    wait(keeper.box, 4)


def run_of_the_tool(box, commands, *words):
    """A run that does this, which the keeper sees as one."""
    box.write("/tmp/bin/remvol", f"#!/bin/sh\n{commands}\n").chmod(0o755)
    return box.run(["/tmp/bin/remvol", *words], env={"LD_PRELOAD": None})


def test_a_target_that_a_recovery_gives_up_is_tried(keeper):
    """Its storage was away for a moment, and its LUNs are late."""
    box = keeper.box
    connected(keeper)
    listen(box)
    run_of_the_tool(box, f"rm -r {SESSIONS}/session1; sleep 3; {gives_up(box, 3)}", "--oiscsi_evt_recover", "-n", "iqn.t1")
    box.wait_until(lambda: wish(box) == ["1", "4", "2"], what="the wish")
    keeper.wait_runs(("--status",), CONNECT)


@pytest.mark.parametrize("words", [("--modify", "-n", "iqn.t1"), ("--connect", "-n", "iqn.t1")], ids=" ".join)
def test_only_a_run_that_means_it_takes_the_wish_away(keeper, words):
    box = keeper.box
    connected(keeper)
    run_of_the_tool(box, f"rm -r {SESSIONS}/session1; sleep 3; {gives_up(box, 3)}", *words)
    box.wait_until(lambda: wish(box) == ["1", "4", "2"], what="the wish")


@pytest.mark.parametrize("words", [("--disconnect", "-n", "iqn.t1"), ("--del", "-n", "iqn.t1")], ids=" ".join)
def test_a_target_whose_wish_was_taken_away_while_it_was_given_up_stays_so(keeper, words):
    box = keeper.box
    connected(keeper)
    run_of_the_tool(box, f"rm -r {SESSIONS}/session1; sleep 3; {gives_up(box, 3)}", *words)
    wait(box, 5)
    assert wish(box) == ["0", "0", "3"]


def test_a_target_that_goes_with_all_others_stays_away(keeper):
    """Its wish stays in the settings, for the next start."""
    box = keeper.box
    connected(keeper)
    listen(box)
    run_of_the_tool(box, f"sleep 3; rm -r {SESSIONS}/session1; sleep 3", "--disconnect")
    wait(box, 6)
    assert keeper.runs == []


def test_a_connection_by_hand_that_fails_leaves_no_wish(keeper):
    box = keeper.box
    keeper.target(1, port=3260, state=0, wanted=0)
    keeper.start()
    wait(box, 3)
    run_of_the_tool(box, gives_up(box, 3, before="sleep 3"), *CONNECT)
    wait(box, 5)
    assert wish(box) == ["0", "0", "3"] and keeper.runs == []


def test_a_try_goes_on_when_the_keeper_starts_anew(keeper):
    box = keeper.box
    keeper.target(1, port=3260)
    listen(box)
    box.fake("remvol", "--connect", effect=gives_up(box, 3, before="sleep 8"), status=255)
    keeper.start()
    keeper.wait_runs(("--status",), CONNECT)
    keeper.daemon.kill(signal.SIGTERM)
    keeper.daemon.wait()
    at_work(box, *CONNECT, seconds=9)  # a fake has another name
    keeper.start()
    box.wait_until(lambda: wish(box) == ["1", "4", "2"], timeout=30, what="the wish")


@pytest.mark.parametrize("words, back", [("--disconnect -n iqn.t1", True), ("--disconnect", False)], ids=["one", "all"])
def test_a_disconnection_that_a_try_overtakes_has_the_last_word(keeper, words, back):
    """It began between the look of the try and its connection, which waited for it. That of all takes no wish away."""
    box = keeper.box
    keeper.target(1, port=3260)
    listen(box)
    box.write("/tmp/bin/remvol", "#!/bin/sh\nsleep 2\n").chmod(0o755)
    store = SET.format(box.build)
    box.fake("remvol", "--connect", effect=f"/tmp/bin/remvol {words}; {store}/conn_set 1")
    keeper.start()
    keeper.wait_runs(("--status",), CONNECT)
    wait(box, 5)
    assert (keeper.runs[2:3] == [("--disconnect", "-n", "iqn.t1")]) == back


def test_a_target_that_was_given_up_at_start_up_is_tried(keeper):
    box = keeper.box
    keeper.target(1, port=3260, state=0, wanted=0)
    box.tree.set({f"{VOLUME.format(1)}/volume_state": 4})
    listen(box)
    keeper.start()
    keeper.wait_runs(("--status",), CONNECT)
    assert wish(box) == ["1", "4", "2"]


def test_a_target_that_was_given_up_at_start_up_is_tried_beside_a_recovery(keeper):
    """The listener has every connected target recovered as it starts."""
    box = keeper.box
    at_work(box, "--oiscsi_evt_recover", "-n", "iqn.t2")
    keeper.target(1, port=3260, state=0, wanted=0)
    box.tree.set({f"{VOLUME.format(1)}/volume_state": 4})
    keeper.start()
    box.wait_until(lambda: wish(box) == ["1", "4", "2"], what="the wish")


def test_a_target_that_a_later_start_up_gives_up_is_tried(keeper):
    """The tree was empty when the keeper began."""
    box = keeper.box
    keeper.start()
    wait(box, 3)
    commands = f"sleep 3; {SET.format(box.build)}/target iqn.t1; {gives_up(box, 4, more='sleep 3')}"
    run_of_the_tool(box, commands, "--init")
    box.wait_until(lambda: wish(box) == ["1", "4", "2"], what="the wish")


def test_a_volume_that_had_failed_before_hides_no_target_that_is_given_up(keeper):
    box = keeper.box
    keeper.target(1, port=3260)
    box.tree.set({f"{VOLUME.format(1)}/volume_state": 3})
    listen(box)
    box.fake("remvol", "--connect", effect=gives_up(box, 3), status=255)
    keeper.start()
    keeper.wait_runs(("--status",), CONNECT, CONNECT)
    box.wait_until(lambda: wish(box) == ["1", "4", "2"], what="the wish")


def test_a_target_that_is_disconnected_while_a_try_fails_stays_so(keeper):
    box = keeper.box
    keeper.target(1, port=3260)
    listen(box)
    box.write("/tmp/bin/remvol", "#!/bin/sh\nsleep 2\n").chmod(0o755)
    box.fake("remvol", "--connect", effect=gives_up(box, 3, "/tmp/bin/remvol --disconnect -n iqn.t1; sleep 2"), status=255)
    keeper.start()
    keeper.wait_runs(("--status",), CONNECT)
    wait(box, LONG_ENOUGH)
    assert keeper.runs == [("--status",), CONNECT] and wish(box) == ["0", "0", "3"]


@pytest.mark.parametrize("values", [{"state": 0, "wanted": 0}, {"state": 0, "wanted": 0, "volume": 3}], ids=["plain", "failed"])
def test_a_disconnected_target_stays_disconnected(keeper, values):
    box = keeper.box
    volume_state = values.pop("volume", 0)
    keeper.target(1, port=3260, **values)
    box.tree.set({f"{VOLUME.format(1)}/volume_state": volume_state})
    listen(box)
    keeper.start()
    wait(box, 6)
    assert keeper.runs == [] and wish(box) == ["0", "0", str(volume_state)]


def test_a_try_of_a_target_ends_with_the_keeper(keeper):
    keeper.target(1, port=3260)
    listen(keeper.box)
    keeper.box.fake("remvol", "--status", delay=3)
    keeper.start()
    keeper.wait_runs(("--status",))
    keeper.daemon.kill(signal.SIGKILL)
    keeper.daemon.wait()
    keeper.daemon = None
    wait(keeper.box, 5)
    assert keeper.runs == [("--status",)]


def test_a_try_that_does_not_end_holds_up_no_other_target(keeper):
    for number in (1, 2):
        keeper.target(number, port=3260)
    listen(keeper.box)
    keeper.box.fake("remvol", "--connect -n iqn.t1", delay=1000)
    keeper.start()
    keeper.box.wait_until(lambda: ("--connect", "-n", "iqn.t2") in keeper.runs, timeout=120, what="the other target")
    assert keeper.runs.count(("--connect", "-n", "iqn.t1")) == 1


def test_volumes_of_a_lost_session_are_recovered(keeper):
    box = keeper.box
    keeper.target(1, port=3260)
    box.tree.set({"/iscsi/initiator/id:1/lun/id:1/share": "Photos"})
    box.run(["/bin/mkdir", "-p", "/mnt/VV/Photos"])
    done = box.run(["/bin/mount", "-t", "tmpfs", "vol", "/mnt/VV/Photos"], env={"LD_PRELOAD": None})
    assert done.status == 0, done.stderr
    listen(box)
    keeper.start()
    keeper.wait_runs(("--oiscsi_evt_reopen", "-n", "iqn.t1"), ("--status",), ("--oiscsi_evt_recover", "-n", "iqn.t1"))




def volume(keeper, slot, disk, share, **values):
    """A volume of the connected target t1, whose disk runs and shows a file system; it is mounted."""
    box = keeper.box
    good = {"lun": slot - 1, "share": share, "enable": 1, "volume_state": 0, "format_state": 0}
    box.tree.set({f"{VOLUME.format(slot)}/{key}": value for key, value in {**good, **values}.items()})
    device = f"{SESSIONS}/session1/device/target1:0:0/1:0:0:{slot - 1}"
    box.write(f"{device}/state", "running\n")
    box.path(f"{device}/block/{disk}").mkdir(parents=True)
    box.disk(disk, 1 << 20)
    # The partition is a device by itself, so that what is on it can be mounted.
    backing = box.disk(f"{disk}1", 1 << 20)
    subprocess.run(["mke2fs", "-q", "-F", "-t", "ext4", "-O", "^has_journal", backing], check=True)
    box.path(f"/mnt/VV/{share}").mkdir(parents=True)
    mount(box, share)
    box.hook("sys_get_partition_list", f"/dev/{disk}", ret=1, out=f"{disk}1")


def photos(keeper, initiator=True, **values):
    """Two volumes that are mounted, and that the keeper has seen."""
    box = keeper.box
    keeper.target(1, state=1)
    keeper.session(1)
    if initiator:
        lives(box, "iscsid")
    volume(keeper, 1, "sdb", "Photos", **values)
    volume(keeper, 2, "sdc", "Music")
    keeper.start()
    wait(box, 3)
    return box


def wait(box, seconds):
    box.run(["/bin/sleep", str(seconds)], env={"LD_PRELOAD": None})


DISKS = {"Photos": "sdb", "Music": "sdc"}


def mount(box, share):
    done = box.run(["/bin/mount", "-t", "ext4", f"/dev/{DISKS[share]}1", f"/mnt/VV/{share}"], env={"LD_PRELOAD": None})
    assert done.status == 0, done.stderr


def unmount(box, share="Photos"):
    done = box.run(["/bin/umount", f"/mnt/VV/{share}"], env={"LD_PRELOAD": None})
    assert done.status == 0, done.stderr


# A volume is missed after ten looks.
MISSED = "Photos was unmounted by somebody else, it is mounted as soon as it can be unless its target is disconnected"
LEFT = "Photos was unmounted by somebody who works on its disk, it stays so"
MISSED_SOON, LONG_ENOUGH = 30, 13


def wait_missed(keeper):
    keeper.box.wait_until(lambda: MISSED in keeper.daemon.stderr, timeout=MISSED_SOON, what="its being missed")


def test_a_volume_that_somebody_else_unmounts_is_mounted_again(keeper):
    box = photos(keeper)
    assert keeper.runs == []
    unmount(box)
    wait_missed(keeper)
    keeper.wait_runs(CONNECT)
    mount(box, "Photos")
    box.wait_until(lambda: "Photos is mounted again" in keeper.daemon.stderr, what="its being told")
    told = [line for line in keeper.daemon.stderr.splitlines() if "Photos" in line]
    assert told == [f"remvol-keeper: {MISSED}", "remvol-keeper: Photos is mounted again"]


def run_down(box):
    box.write(f"{SESSIONS}/session1/device/target1:0:0/1:0:0:1/state", "offline\n")


def nothing_recognised(box):
    box.hook("sys_get_fs_type", "/dev/sdc1", ret=1, first=True)
    unmount(box, "Music")


def another_disk_there(box):
    unmount(box, "Music")
    done = box.run(["/bin/mount", "-t", "tmpfs", "vol", "/mnt/VV/Music"], env={"LD_PRELOAD": None})
    assert done.status == 0, done.stderr


def wants_a_check(box):
    unmount(box, "Music")
    box.hook("sys_check_fs_state", "/dev/sdc1", ret=1)


def not_partitioned(box):
    box.hook("sys_get_partition_list", "/dev/sdc", ret=0, first=True)
    unmount(box, "Music")


def test_a_volume_waits_for_the_initiator(keeper):
    """A new one takes the sessions over, and their disks do not run meanwhile."""
    iscsid = lives(keeper.box, "iscsid")
    box = photos(keeper, initiator=False)
    iscsid.kill()
    unmount(box)
    wait_missed(keeper)
    wait(box, 4)
    assert keeper.runs == []
    lives(box, "iscsid")
    keeper.wait_runs(CONNECT)


def a_second_session(box):
    box.write(f"{SESSIONS}/session2/targetname", "iqn.t1\n")
    box.write(f"{SESSIONS}/session2/state", "LOGGED_IN\n")


def switched_on_otherwise(box):
    box.tree.set({f"{VOLUME.format(2)}/enable": 2})
    nothing_recognised(box)


def failed(box):
    unmount(box, "Music")
    box.tree.set({f"{VOLUME.format(2)}/volume_state": 3})


def being_formatted(box):
    unmount(box, "Music")
    box.tree.set({f"{VOLUME.format(2)}/format_state": 4})


@pytest.mark.parametrize("sibling", [run_down, nothing_recognised, another_disk_there, wants_a_check, not_partitioned, failed,
                                     being_formatted, switched_on_otherwise])
def test_a_volume_waits_while_a_connection_could_harm_another_one_of_its_target(keeper, sibling):
    box = photos(keeper)
    sibling(box)
    unmount(box)
    wait_missed(keeper)
    wait(box, 5)
    assert keeper.runs == []


@pytest.mark.parametrize("late", [False, True], ids=["soon", "when it is missed"])
@pytest.mark.parametrize("use", ["'/dev/sdb', os.O_RDONLY | os.O_EXCL", "'/dev/sdb1', os.O_WRONLY"], ids=["exclusive", "writing"])
def test_a_volume_on_whose_disk_somebody_works_is_left_to_him(keeper, use, late):
    """Also between his steps, and after the last one."""
    box = photos(keeper)
    if late:
        box.hook("sys_check_fs_state", "/dev/sdb1", ret=1)
    unmount(box)
    if late:
        wait_missed(keeper)
    work = f"import os,time\nos.open({use})\ntime.sleep(5)"
    assert box.run(["/usr/bin/python3", "-c", work], env={"LD_PRELOAD": None}).status == 0
    box.hook("sys_check_fs_state", "/dev/sdb1", ret=0, first=True)
    wait(box, LONG_ENOUGH)
    assert keeper.runs == [] and keeper.daemon.stderr.count(LEFT) == 1
    mount(box, "Photos")
    wait(box, 3)
    unmount(box)
    keeper.wait_runs(CONNECT)


def test_whoever_looks_at_all_disks_now_and_then_does_not_work_on_it(keeper):
    box = photos(keeper)
    unmount(box)
    script = "import os,time\nfor _ in range(3):\n file = os.open('/dev/sdb', os.O_RDONLY)\n time.sleep(0.3)\n os.close(file)\n time.sleep(2.5)"
    assert box.run(["/usr/bin/python3", "-c", script], env={"LD_PRELOAD": None}).status == 0
    keeper.wait_runs(CONNECT)
    assert LEFT not in keeper.daemon.stderr


@pytest.mark.parametrize("name", ["remvol", "(udev-worker)", "systemd-udevd"])
def test_whoever_only_looks_at_a_disk_does_not_work_on_it(keeper, name):
    box = photos(keeper)
    script = f"import os,time\nopen('/proc/self/comm', 'w').write('{name}')\nos.open('/dev/sdb1', os.O_RDONLY)\ntime.sleep(3)"
    unmount(box)
    assert box.run(["/usr/bin/python3", "-c", script], env={"LD_PRELOAD": None}).status == 0
    keeper.wait_runs(CONNECT)
    assert LEFT not in keeper.daemon.stderr


def test_a_volume_whose_disk_is_mounted_elsewhere_waits(keeper):
    box = photos(keeper)
    subprocess.run(["mke2fs", "-q", "-F", box.path("/dev/sdb")], check=True)
    box.path("/srv/work").mkdir(parents=True)
    unmount(box)
    done = box.run(["/bin/mount", "-t", "ext4", "/dev/sdb", "/srv/work"], env={"LD_PRELOAD": None})
    assert done.status == 0, done.stderr
    wait_missed(keeper)
    wait(box, 4)
    assert keeper.runs == []
    assert box.run(["/bin/umount", "/srv/work"], env={"LD_PRELOAD": None}).status == 0
    keeper.wait_runs(CONNECT)


def test_a_volume_whose_disk_is_below_a_loop_device_is_left_alone(keeper):
    box = photos(keeper)
    box.write("/sys/class/block/loop7/loop/backing_file", "/dev/sdb1\n")
    box.write("/sys/class/block/sdb/size", "1\n")
    unmount(box)
    wait(box, LONG_ENOUGH)
    assert keeper.runs == [] and LEFT in keeper.daemon.stderr


@pytest.mark.parametrize("values", [{"enable": 0}, {"volume_state": 3}, {"format_state": 1}], ids=["off", "failed", "formatted"])
def test_a_volume_that_is_not_to_be_mounted_stays_so(keeper, values):
    box = photos(keeper, **values)
    unmount(box)
    wait(box, LONG_ENOUGH)
    assert keeper.runs == [] and "Photos" not in keeper.daemon.stderr


def test_a_volume_that_was_not_mounted_yet_is_left_alone(keeper):
    box = keeper.box
    keeper.target(1, state=1)
    keeper.session(1)
    volume(keeper, 1, "sdb", "Photos")
    unmount(keeper.box)
    keeper.start()
    wait(box, LONG_ENOUGH)
    assert keeper.runs == [] and "Photos" not in keeper.daemon.stderr


def lost(box):
    box.write(f"{SESSIONS}/session1/state", "FAILED\n")


@pytest.mark.parametrize("session", [lost, a_second_session])
def test_a_volume_of_a_lost_session_or_of_two_is_not_the_keepers(keeper, session):
    box = photos(keeper)
    session(box)
    unmount(box)
    wait(box, LONG_ENOUGH)
    assert keeper.runs == [] and "Photos" not in keeper.daemon.stderr


def test_a_volume_waits_while_its_target_has_two_sessions(keeper):
    box = photos(keeper)
    a_second_session(box)
    unmount(box)
    wait(box, 3)
    shutil.rmtree(box.path(f"{SESSIONS}/session2"))
    keeper.wait_runs(CONNECT)


@pytest.mark.parametrize("command, late", [("--disconnect", False), ("--disc", True), ("--format", False), ("--del_lun", True)])
def test_a_volume_that_the_tool_takes_away_stays_away(keeper, command, late):
    box = photos(keeper)
    if late:
        unmount(box)
        wait(box, 3)
    run = at_work(box, command, "-n", "iqn.t1", seconds=3)
    if not late:
        unmount(box)
    run.wait()
    wait(box, LONG_ENOUGH)
    assert keeper.runs == [] and "Photos" not in keeper.daemon.stderr


def test_a_volume_that_a_command_for_another_target_leaves_alone_is_mounted_again(keeper):
    box = photos(keeper)
    at_work(box, "--disconnect", "-n", "iqn.t2")
    unmount(box)
    wait_missed(keeper)
    keeper.wait_runs(CONNECT)


def test_a_volume_that_the_tool_did_not_mount_is_left_to_a_person(keeper):
    box = photos(keeper)
    unmount(box)
    keeper.wait_runs(CONNECT)
    wait(box, 5)
    assert keeper.runs == [CONNECT]
    mount(box, "Photos")
    box.wait_until(lambda: "Photos is mounted again" in keeper.daemon.stderr, what="its being told")
    unmount(box)
    keeper.wait_runs(CONNECT, CONNECT)


def test_a_volume_is_not_mounted_beside_another_run_that_mounts(keeper):
    box = photos(keeper)
    at_work(box, "--add", "-n", "iqn.t1")
    unmount(box)
    wait(box, LONG_ENOUGH)
    assert keeper.runs == []


def test_a_try_ends_with_the_keeper(keeper):
    box = photos(keeper)
    box.hook("sys_check_fs_state", "/dev/sdb1", ret=0, delay=5)
    unmount(box)
    wait_missed(keeper)
    wait(box, 1)
    keeper.daemon.kill(signal.SIGKILL)
    keeper.daemon.wait()
    keeper.daemon = None
    wait(box, 7)
    assert keeper.runs == []


def test_the_initiator_is_started_when_it_is_gone(keeper):
    keeper.start()
    keeper.box.wait_until(lambda: keeper.box.runs("iscsid"), what="iscsid being started")
    assert list(keeper.box.runs("iscsid")[0]) == ["-f"]


def test_the_initiator_of_a_container_is_not_this_machines(keeper):
    box = keeper.box
    lives(box, "iscsid", under=["/usr/bin/unshare", "--pid", "--fork"])
    keeper.start()
    box.wait_until(lambda: box.runs("iscsid"), what="iscsid being started")


def test_an_initiator_that_dies_again_and_again_is_told_of_once(keeper):
    keeper.box.fake("iscsid", skip=2, delay=1000)
    keeper.start()
    keeper.box.wait_until(lambda: "there again" in keeper.daemon.stderr, what="iscsid being there")
    assert len(keeper.box.runs("iscsid")) == 3
    assert keeper.daemon.stderr.splitlines() == ["remvol-keeper: iscsid is gone, starting another one",
                                                 "remvol-keeper: iscsid is there again"]


def test_without_the_tree_nothing_is_started(keeper):
    keeper.box.tree.stop()
    keeper.start()
    keeper.box.run(["/bin/sleep", "5"], env={"LD_PRELOAD": None})
    assert keeper.box.runs("iscsid") == []
