"""The status texts of targets and LUNs, as `--status` composes them from what the tree and the system say."""

import pytest

from harness import log_lines
from harness.initiator import T1, T2, Initiator
from harness.initiator import store as store_target

ROOT = "/iscsi/initiator/id:1"
LUN = ROOT + "/lun/id:1"


def store(box, *, conn_set="1", conn_state=None, **lun):
    """Stores one target with one LUN that has a device; a LUN's key that is None is left out."""
    lun = {"mnt_dev": "/dev/sdb1", **lun}
    store_target(box, T1, conn_set=conn_set, conn_state=conn_state, luns=[("data", 0, lun)])


def sessions(box, connected=True, disk=True):
    """What iscsiadm shows: the target with or without a disk, or another one's session."""
    initiator = Initiator(box)
    name = T1 if connected else T2
    initiator.offer(name, {0: "sdb" if disk else None})
    initiator.log_in(name)


def mount_volume(box, size=1 << 20):
    box.run(["/bin/sh", "-c", f"mkdir -p /mnt/VV/data && /bin/mount -t tmpfs -o size={size} volume /mnt/VV/data"])


def status(box):
    done = box.remvol("--status")
    assert done.status == 0, done.stdout
    return box.tree.get(f"{LUN}/status")


# format state, volume state -> text without and with the read-only right; fs: a file system is recognised
UNMOUNTED = [
    ("4", "1", "Creating Volume", "Creating Volume"),
    ("0", "1", "Creating Volume", "Creating Volume"),
    ("3", "1", "Creating Volume", "Creating Volume"),
    ("0", "5", "Unsupported File System", "Unsupported File System ( Read Only )"),
    ("3", "5", "Unsupported File System", "Unsupported File System ( Read Only )"),
    ("0", "0", "Offline", "Offline"),
    ("4", "0", "Offline", "Offline"),
    ("0", "2", "Offline", "Offline"),
    (None, None, "Offline", "Offline"),
    ("3", "0", "Create Volume Failed", "Create Volume Failed ( Read Only )"),
    ("0", "3", "Create Volume Failed", "Create Volume Failed ( Read Only )"),
]
UNFORMATTED = [
    ("4", "0", "Wait to Format", "Wait to Format"),
    ("4", "1", "Wait to Format", "Wait to Format"),
    ("0", "1", "Creating Volume", "Creating Volume"),
    ("3", "1", "Creating Volume", "Creating Volume"),
    ("0", "2", "Offline", "Offline"),
    ("0", "5", "Unsupported File System", "Unsupported File System"),
    ("0", "0", "No Format", "No Format ( Read Only )"),
    (None, None, "No Format", "No Format ( Read Only )"),
    ("0", "4", "No Format", "No Format ( Read Only )"),
    ("3", "0", "Create Volume Failed", "Create Volume Failed ( Read Only )"),
    ("3", "2", "Create Volume Failed", "Create Volume Failed ( Read Only )"),
    ("3", "5", "Create Volume Failed", "Create Volume Failed ( Read Only )"),
    ("0", "3", "Create Volume Failed", "Create Volume Failed ( Read Only )"),
]


def by_right(rows):
    """A row of two texts becomes one of each access right."""
    return [(*states, right, text) for *states, writable, read_only in rows for right, text in (("1", writable), ("0", read_only))]


@pytest.mark.parametrize("format_state,volume_state,right,text", by_right(UNMOUNTED))
def test_a_recognised_file_system_that_is_not_mounted(box, format_state, volume_state, right, text):
    store(box, format_state=format_state, volume_state=volume_state, vol_access_right=right)
    sessions(box)
    box.hook("sys_get_fs_type", "/dev/sdb1", out="ext4", ret=0)
    assert status(box) == text
    assert box.tree.get(f"{LUN}/size") == "0/0"
    assert box.tree.get(f"{LUN}/fs_type") == "ext4"


@pytest.mark.parametrize("format_state,volume_state,right,text", by_right(UNFORMATTED))
def test_no_file_system_is_recognised(box, format_state, volume_state, right, text):
    store(box, format_state=format_state, volume_state=volume_state, vol_access_right=right)
    sessions(box)
    box.hook("sys_get_fs_type", "/dev/sdb1", ret=1)
    assert status(box) == text
    assert box.tree.get(f"{LUN}/size") == "0/0"
    assert box.tree.get(f"{LUN}/fs_type") is None


@pytest.mark.parametrize("right,text", [("1", "Running"), ("0", "Running ( Read Only )"), (None, "Running")])
def test_a_mounted_volume_is_running_and_shows_its_size(box, right, text):
    store(box, vol_access_right=right, format_state="3", volume_state="3")
    sessions(box)
    mount_volume(box)
    box.hook("sys_get_fs_type", "/dev/sdb1", out="ext4", ret=0)
    assert status(box) == text
    used, total = box.tree.get(f"{LUN}/size").split("/")
    assert int(total) == 1 << 20 and int(used) < int(total)


def test_the_size_of_a_volume_may_be_beyond_16_tebibytes(box):
    store(box)
    sessions(box)
    mount_volume(box, size=20 << 40)
    box.hook("sys_get_fs_type", "/dev/sdb1", out="ext4", ret=0)
    assert status(box) == "Running"
    assert box.tree.get(f"{LUN}/size").split("/")[1] == str(20 << 40)


def test_a_format_shows_its_progress(box):
    store(box, format_state="1", format_progress="37")
    sessions(box, disk=False)
    assert status(box) == "Formatting 37%"
    assert box.tree.get(f"{LUN}/size") == "0/0"


def test_a_format_without_stored_progress_shows_zero(box):
    store(box, format_state="1")
    sessions(box)
    assert status(box) == "Formatting 0%"


@pytest.mark.parametrize("volume_state", ["0", "1"])
@pytest.mark.parametrize("fs_type, last_look", [("", ("sys_get_fs_type", "/dev/sdb1")),
                                                ("ext4", ("sys_get_df_info", "/mnt/VV/data"))])
def test_a_format_that_begins_while_the_disk_is_looked_at_shows(box, fs_type, last_look, volume_state):
    store(box, format_state="0", volume_state=volume_state)
    sessions(box)
    begin = "; ".join(f"ktreec -S /var/run/ktree_sock_vv -s {LUN}/{key} {value}"
                      for key, value in (("format_state", 1), ("format_progress", 7)))
    box.hook(*last_look, ret=-1, effect=begin)
    box.hook("sys_get_fs_type", "/dev/sdb1", out=fs_type, ret=0)
    assert status(box) == "Formatting 7%"


def test_the_progress_of_a_format_that_has_ended_meanwhile_is_not_written(box):
    store(box, format_state="1", format_progress="7", volume_state="1")
    sessions(box)
    end = "; ".join(f"ktreec -S /var/run/ktree_sock_vv -s {LUN}/{key} {value}"
                    for key, value in (("volume_state", 3), ("format_state", 0)))
    box.hook("ktreec_get_wb", f"{LUN}/volume_state", through=True, times=1, effect=end)
    box.hook("sys_get_fs_type", "/dev/sdb1", ret=1)
    assert box.remvol("--status").status == 0
    assert box.tree.get(f"{LUN}/status") == "Create Volume Failed"


def test_no_format_begins_between_the_look_at_the_states_and_the_text(box):
    """Whoever stores a state has the slots, which are not to be had meanwhile."""
    store(box, format_state="0")
    sessions(box)
    box.hook("sys_get_fs_type", "/dev/sdb1", ret=1)
    had = "flock -n -s /run/remvol/slots.lock true; echo $? >>/root/had"
    box.hook("ktreec_get_wb", f"{LUN}/volume_state", through=True, skip=1, effect=had)
    box.hook("ktreec_set", f"{LUN}/status", through=True, effect=had)
    assert status(box) == "No Format"
    assert box.path("/root/had").read_text() == "1\n1\n"


@pytest.mark.parametrize("enable", ["0", "", None])
def test_a_disabled_lun_keeps_its_size(box, enable):
    store(box, enable=enable, size="5/9", format_state="1", volume_state="3", vol_access_right="0")
    sessions(box)
    assert status(box) == "Disable"
    assert box.tree.get(f"{LUN}/size") == "5/9"


@pytest.mark.parametrize("right", ["1", "0"])
def test_a_lun_without_a_device_is_offline(box, right):
    store(box, vol_access_right=right, volume_state="3")
    sessions(box, disk=False)
    assert status(box) == "Offline"
    assert box.tree.get(f"{LUN}/size") == "0/0"


# conn_set, stored state, connected -> status text, connect state afterwards
TARGETS = [
    ("1", "3", True, "Reconnecting", "3"),
    ("1", "3", False, "Reconnecting", "3"),
    ("0", "3", True, "Connected", "1"),
    ("0", "3", False, "Disconnected", "0"),
    ("1", "0", True, "Connected", "1"),
    ("1", "4", True, "Connected", "1"),
    ("1", "2", True, "Connected", "1"),
    ("1", "2", False, "Connecting", "2"),
    ("1", "1", False, "Disconnected", "0"),
    ("1", "0", False, "Disconnected", "0"),
    ("1", None, False, "Disconnected", "0"),
    ("1", "4", False, "Connect Error", "4"),
]


@pytest.mark.parametrize("conn_set,state,connected,text,after", TARGETS)
def test_the_text_of_a_target(box, conn_set, state, connected, text, after):
    store(box, conn_set=conn_set, conn_state=state)
    sessions(box, connected=connected)
    status(box)
    assert box.tree.get(f"{ROOT}/status") == text
    assert box.tree.get(f"{ROOT}/conn_state") == after


@pytest.mark.parametrize(
    "state,connected,printed", [("0", True, "1, 1"), ("2", False, "1, 0"), ("0", False, "1, 0")]
)
def test_a_refused_connect_state_is_logged(box, state, connected, printed):
    store(box, conn_state=state)
    sessions(box, connected=connected)
    box.hook("ktreec_set", f"{ROOT}/conn_state", ret=-1)
    done = box.remvol("--status")
    assert f"ktree_set_connect_state({printed}) failed" in done.stdout
    assert f"ktreec_set({ROOT}/conn_state) failed" in done.stdout
    assert done.stdout.count("ktreec_set(") == 1


def test_status_texts_are_tried_three_times_and_the_rest_is_still_written(box):
    store(box)
    sessions(box)
    box.hook("sys_get_fs_type", "/dev/sdb1", out="ext4", ret=0)
    box.hook("ktreec_set", f"{LUN}/fs_type", ret=-1)
    box.hook("ktreec_set", f"{LUN}/status", ret=-1, times=2)
    done = box.remvol("--status")
    assert done.stdout.count(f"ktreec_set({LUN}/fs_type) failed") == 3
    assert done.stdout.count(f"ktreec_set({LUN}/status) failed") == 2
    assert box.tree.get(f"{LUN}/status") == "Offline"
    assert box.tree.get(f"{LUN}/size") == "0/0"


def test_the_log_of_a_status_run(box):
    store(box)
    sessions(box)
    box.hook("sys_get_fs_type", "/dev/sdb1", ret=1)
    box.tree.set("/iscsi/initiator/dbg", "2")
    done = box.remvol("--status")
    for function, text in [
        ("ktree_update_status", f"ktreec_set {ROOT}/status=Connected"),
        ("ktree_update_lun_status", "update lun status start"),
        ("ktree_update_lun_status", f"ktreec_set {LUN}/status=No Format"),
        ("ktree_update_lun_status", f"ktreec_set {LUN}/size=0/0"),
        ("ktree_update_lun_status", "update status end"),
    ]:
        assert ("src.cpp", function, text) in log_lines(done.stdout)
