"""--connect and --disconnect."""

import pytest

from appliance import assert_order, fake, hook, offer, set_up, settings
from harness import messages
from harness.initiator import DETAILS, SHARES

RECORD = "iscsiadm -m node -I default -T iqn.t1 -p 10.9.0.2:3260 -o"
LOGIN = "iscsiadm -m node -T iqn.t1 -p 10.9.0.2:3260 -I default --login"
LOGOUT = 'iscsiadm -m node -T "iqn.t1" --logout'


def connect(box, name="iqn.t1"):
    return box.remvol("--connect", "-n", name)


@pytest.fixture
def stored(site):
    """A target with two LUNs, offered by its portal but not logged in."""
    site.store("iqn.t1", conn_set=0, luns=[("a", 0), ("b", 1)])
    site.offer("iqn.t1", {0: "sdb", 1: "sdc"})
    return site


# What becomes of the first of two volumes: what the platform says of its disk, what goes wrong, state and text.
MOUNTS = {
    "fine": ({}, [], "0", "Running"),
    "unsupported": ({"fs": "reiserfs"}, [], "5", "Unsupported File System"),
    "read-only": ({}, [fake("chmod", "777 /mnt/VV/a", status=1), fake("chmod", real=True)], "0", "Running ( Read Only )"),
    "too small": ({"size": 1000}, [], "2", "Offline"),
    "no file system after formatting": ({"fs": ""}, [fake("dd"), fake("mke2fs")], "0", "No Format"),
    "no partition": ({"fs": "", "parts": 0}, [hook("sys_create_1_partition", "/dev/sdb", ret=1)], "3", "Create Volume Failed"),
    "cannot be formatted": ({"fs": ""}, [fake("dd", status=1)], "3", "Formatting 0%"),
    "no mount point": ({}, [fake("mkdir", "-p /mnt/VV/a", status=1), fake("mkdir", real=True)], "3", "Create Volume Failed"),
    "no disk": ({}, [offer("iqn.t1", {1: "sdc"})], "2", "Offline"),
    "never took hold": ({}, [fake("mount", "-t ext4 /dev/sdb1", status=32)], "0", "No Format"),
}


class TestConnect:
    def test_the_steps_come_in_their_order(self, stored, box):
        stored.disk("sdb")
        stored.disk("sdc")
        done = connect(box)
        assert (done.status, box.tree.get("/result/connect")) == (0, "0")
        assert_order(
            stored.trace(),
            "set /result/connect=",
            "set id:1/conn_state=2",
            "set id:1/status=Connecting",
            f"system {RECORD} delete",
            f"system {RECORD} new",
            "set id:1/conn_state=2",
            f"popen {LOGIN}",
            "set id:1/conn_set=1",
            "set id:1/conn_state=1",
            f"system {DETAILS}",
            "set id:1/lun/id:1/dev=sdb",
            "set id:1/lun/id:2/dev=sdc",
            "sleep 1",
            "set id:1/lun/id:1/volume_state=1",
            'system mount -t ext4 /dev/sdb1 "/mnt/VV/a"',
            "set id:1/lun/id:1/volume_state=0",
            "set id:1/lun/id:1/status=Running",
            "set id:1/lun/id:2/volume_state=1",
            'system mount -t ext4 /dev/sdc1 "/mnt/VV/b"',
            "set id:1/lun/id:2/volume_state=0",
            "set id:1/lun/id:2/status=Running",
            "set id:1/status=Connected",
            f"system {SHARES}",
            "set /result/connect=0",
            "dump /etc/NAS_CFG/vv.xml",
            f"system {SHARES}",
        )
        assert stored.mounted("a") and stored.mounted("b")

    @pytest.mark.parametrize("luns, status, state", [(1, "Connected", "1"), (7, "Connected", "1"), (8, "Reconnecting", "3")])
    def test_a_loss_during_the_mounts_shows_with_eight_luns_alone(self, site, box, luns, status, state):
        """A recovery that follows asks for that state."""
        disks = "bcdefghi"[:luns]
        site.store("iqn.t1", luns=[(disk, number) for number, disk in enumerate(disks)])
        site.offer("iqn.t1", {number: f"sd{disk}" for number, disk in enumerate(disks)})
        for disk in disks:
            site.disk(f"sd{disk}")
        box.hook("system", 'mount -t ext4 /dev/sdb1 "/mnt/VV/b"', through=True, times=1,
                 effect="ktreec -S /var/run/ktree_sock_vv -s /iscsi/initiator/id:1/conn_state 3")
        assert connect(box).status == 0
        assert (site.target("status"), site.target("conn_state")) == (status, state)

    @pytest.mark.parametrize("command", [["--connect", "-n", "iqn.t1"], ["--init"]])
    def test_a_target_that_is_deleted_meanwhile_is_logged_out_alone(self, stored, box, command):
        """An empty name would be every target's."""
        box.tree.set({"/iscsi/initiator/ver": 1, "/iscsi/initiator/id:1/conn_set": 1})
        for program in ("killall", "rmmod", "insmod", "iscsid"):
            box.default(program)
        stored.store("iqn.t2", slot=2, luns=[("other", 0)])
        stored.offer("iqn.t2", {0: "sdd"})
        stored.log_in("iqn.t2")
        stored.disk("sdb")
        box.hook("system", 'mount -t ext4 /dev/sdb1 "/mnt/VV/a"', through=True, times=1,
                 effect="ktreec -S /var/run/ktree_sock_vv -d /iscsi/initiator/id:1")
        box.remvol(*command)
        assert stored.sessions() == ["iqn.t2"]
        assert [line for line in box.shell() if "--logout" in line] == [LOGOUT]

    def test_it_ends_connected_in_every_key(self, stored, box):
        stored.disk("sdb")
        stored.disk("sdc")
        connect(box)
        assert (stored.target("conn_set"), stored.target("conn_state"), stored.target("status")) == (
            "1", "1", "Connected")

    @pytest.mark.parametrize("disk, wrong, state, text", MOUNTS.values(), ids=MOUNTS)
    def test_a_mount_failure_shows_in_its_volume_alone(self, stored, box, disk, wrong, state, text):
        stored.disk("sdb", **disk)
        stored.disk("sdc")
        set_up(stored, wrong)
        assert connect(box).status == 0
        assert (stored.lun("volume_state"), stored.lun("status")) == (state, text)
        assert (stored.lun("volume_state", 2), stored.lun("status", 2)) == ("0", "Running")

    def test_a_target_whose_luns_are_all_disabled_is_logged_in(self, site, box):
        site.store("iqn.t1", luns=[("a", 0, {"enable": 0}), ("b", 1, {"enable": 0})])
        site.offer("iqn.t1", {0: "sdb", 1: "sdc"})
        assert connect(box).status == 0
        assert (site.target("conn_state"), site.target("conn_set")) == ("1", "1")
        assert site.lun("volume_state") is None
        assert not any(line.startswith("mount") for line in box.shell())

    @pytest.mark.parametrize("slot, status", [(1, 0), (2, 255)])
    def test_an_unreadable_enable_counts_unless_a_later_lun_is_fine(self, stored, box, slot, status):
        stored.disk("sdb")
        stored.disk("sdc")
        box.hook("ktreec_get_wb", f"/iscsi/initiator/id:1/lun/id:{slot}/enable", ret=-1)
        assert connect(box).status == status
        other = 3 - slot
        assert stored.lun("volume_state", slot) is None
        assert stored.lun("volume_state", other) == "0"
        assert stored.target("status") == "Connected"

    def test_the_walk_over_the_luns_stops_at_the_first_empty_slot(self, site, box):
        site.store("iqn.t1", luns=[("a", 0), ("gone", ""), ("c", 2)])
        site.offer("iqn.t1", {0: "sdb", 2: "sdd"})
        site.disk("sdb")
        assert connect(box).status == 0
        assert site.lun("volume_state", 1) == "0"
        assert site.lun("volume_state", 3) is None

    def test_eight_luns_are_all_mounted(self, site, box):
        disks = {n: f"sd{'bcdefghi'[n]}" for n in range(8)}
        site.store("iqn.t1", luns=[(f"s{n}", n) for n in disks])
        site.offer("iqn.t1", disks)
        for dev in disks.values():
            site.disk(dev)
        assert connect(box).status == 0
        assert all(site.mounted(f"s{n}") for n in disks)

    def test_an_unknown_target(self, stored, box):
        stored.debug(1)
        before = settings(box)
        done = connect(box, "iqn.t2")
        assert done.status == 255
        assert "Can not find: iqn.t2" in messages(done)
        assert messages(done)[-1] == "task_connect() failed"
        assert settings(box) == before
        assert box.shell() == ["winshare_reload"]

    def test_a_failed_login(self, stored, box):
        stored.refuse("iqn.t1")
        done = connect(box)
        assert done.status == 255
        assert "Target_Connect failed , target name = iqn.t1" in messages(done)
        assert (stored.target("conn_state"), stored.target("conn_set")) == ("4", "0")
        assert DETAILS not in box.shell()
        assert box.tree.get("/result/connect") == "-1"

    def test_no_interface_for_the_portal(self, site, box):
        site.store("iqn.t1", ip="", conn_set=0)
        assert connect(box).status == 255
        assert site.target("conn_state") == "4"

    def test_an_old_record_that_cannot_be_replaced_does_not_matter(self, stored, box):
        box.fake("iscsiadm", "-m node -I default -T iqn.t1 -p 10.9.0.2:3260 -o", status=6)
        stored.disk("sdb")
        stored.disk("sdc")
        assert connect(box).status == 0

    @pytest.mark.parametrize(
        "listing, text",
        [
            ("Target: iqn.t1\n\t\tiSCSI Session State: LOGGED_IN\n",
             "Can not find Device for Target: iqn.t1 on iscsiadm -m session"),
            ("Target: iqn.t10\n\t\tiSCSI Session State: LOGGED_IN\n",
             "Can not find Target: iqn.t1 on iscsiadm -m session"),
        ],
    )
    def test_a_session_without_a_disk_is_given_up(self, stored, box, listing, text):
        stored.debug(1)
        box.fake("iscsiadm", "-m session -P3", stdout=listing)
        done = connect(box)
        assert done.status == 255
        said = messages(done)
        # The message of a failed logout is the one of a logout that worked.
        assert said.index(text) < said.index("Logout Fail on Target: iqn.t1 ")
        assert_order(
            stored.trace(),
            "set id:1/conn_set=1",
            "set id:1/conn_state=1",
            f"system {LOGOUT}",
            "set id:1/conn_state=0",
            "set id:1/conn_set=0",
            "set id:1/lun/id:1/volume_state=3",
            "set id:1/lun/id:2/volume_state=3",
            "set /result/connect=-1",
        )
        assert not stored.logged_in("iqn.t1")
        assert "sleep 1" not in stored.trace()

    def test_a_logout_that_fails_says_nothing_of_its_own(self, stored, box):
        stored.debug(1)
        box.fake("iscsiadm", "-m session -P3", stdout="Target: iqn.t1\n")
        box.fake("iscsiadm", "-m node -T iqn.t1 --logout", status=10)
        done = connect(box)
        assert done.status == 255
        assert "Logout Fail on Target: iqn.t1 " not in messages(done)
        assert f"system() of cmd '{LOGOUT}' failed" in messages(done)
        assert (stored.target("conn_set"), stored.lun("volume_state")) == ("0", "3")

    def test_a_listing_that_fails_gives_the_session_up_without_a_reason(self, stored, box):
        stored.debug(1)
        box.fake("iscsiadm", "-m session -P3", status=6)
        done = connect(box)
        assert done.status == 255
        assert not any("Can not find" in line for line in messages(done))
        assert stored.lun("volume_state") == "3"
        assert not stored.logged_in("iqn.t1")

    def test_a_tree_that_takes_no_device_names_counts_as_success(self, stored, box):
        box.hook("ktreec_set", "/iscsi/initiator/id:1/lun/id:1/dev", ret=-1)
        done = connect(box)
        assert done.status == 0
        assert "ktree failed, exit..." in messages(done)
        assert stored.logged_in("iqn.t1")
        assert (stored.target("conn_state"), stored.lun("volume_state")) == ("1", None)

    def test_the_result_is_logged_at_the_end(self, stored, box):
        stored.debug(2)
        stored.disk("sdb")
        stored.disk("sdc")
        said = messages(connect(box))
        assert "end, ret = 0" in said
        box.fake("iscsiadm", "-m session -P3", status=6, first=True)
        assert "end, ret = -1" in messages(connect(box))


class TestDisconnect:
    def test_one_target_is_unmounted_and_logged_out(self, stored, box):
        stored.disk("sdb")
        stored.disk("sdc")
        connect(box)
        box.forget()
        done = box.remvol("--disconnect", "-n", "iqn.t1")
        assert (done.status, box.tree.get("/result/disconnect")) == (0, "0")
        assert_order(
            stored.trace(),
            'system umount -f "/mnt/VV/a"',
            'system umount -f "/mnt/VV/b"',
            f"system {SHARES}",
            f"system {LOGOUT}",
            "set id:1/conn_state=0",
            "set id:1/conn_set=0",
            "set id:1/status=Disconnected",
            "dump /etc/NAS_CFG/vv.xml",
            f"system {SHARES}",
        )
        assert not stored.mounted("a") and not stored.mounted("b")
        assert not stored.logged_in("iqn.t1")

    def test_a_failed_logout_is_not_told(self, stored, box):
        assert box.remvol("--disconnect", "-n", "iqn.t1").status == 0
        assert stored.target("status") == "Disconnected"

    @pytest.mark.parametrize("name", ["iqn.t2", "", "x" * 255])
    def test_an_unknown_target(self, stored, box, name):
        before = settings(box)
        done = box.remvol("--disconnect", "-n", name)
        assert (done.status, messages(done)) == (255, [f"Can not get entry from {name[:255]}"])
        assert settings(box) == before
        assert box.shell() == ["winshare_reload"]

    def test_everything_without_a_name(self, stored, box):
        stored.disk("sdb")
        stored.disk("sdc")
        connect(box)
        stored.store("iqn.t2", slot=2, luns=[("c", 0)])
        stored.debug(1)
        box.forget()
        done = box.remvol("--disconnect")
        assert (done.status, box.tree.get("/result/disconnect")) == (0, "0")
        assert_order(
            stored.trace(),
            'system umount -f "/mnt/VV/a"',
            'system umount -f "/mnt/VV/b"',
            f"system {SHARES}",
            "system iscsiadm -m node -u",
            "set /result/disconnect=0",
        )
        said = messages(done)
        assert said.index("update share folder status") < said.index("finish share folder status")
        # What the user asked for stays as it was: the next start connects again.
        assert (stored.target("conn_set"), stored.target("conn_state")) == ("1", "1")

    @pytest.mark.parametrize("status", [0, 21, 10])
    def test_the_logout_of_everything_decides_even_without_a_target(self, site, box, status):
        site.debug(1)
        box.fake("iscsiadm", "-m node -u", status=status)
        done = box.remvol("--disconnect")
        assert done.status == (255 if status else 0)
        assert f"system {SHARES}" in site.trace()
        said = messages(done)
        assert ("system() of cmd 'iscsiadm -m node -u' failed" in said) == (status != 0)
        assert ("task_disconnect(all) failed" in said) == (status != 0)


class TestBadInput:
    @pytest.mark.parametrize("name", ["", "iqn.t", "iqn.t11", "IQN.T1", "x" * 255])
    def test_names_that_nobody_has(self, stored, box, name):
        before = settings(box)
        done = connect(box, name)
        assert (done.status, messages(done)) == (255, [f"Can not get entry from {name[:255]}"])
        assert settings(box) == before

    def test_no_name(self, stored, box):
        before = settings(box)
        assert box.remvol("--connect").status == 255
        assert settings(box) == before
