"""--add and --check_share_name."""

import pytest

from appliance import assert_order, fake, hook, set_up, settings
from harness import messages
from harness.initiator import DETAILS, SESSIONS, SHARES

OPTIONS = {"-n": "iqn.t1", "-l": "0", "-i": "10.9.0.2", "-p": "3260", "-s": "data"}
RECORD = 'iscsiadm -m node -I default -T iqn.t1 -p 10.9.0.2:3260 -o'


def add(box, *more, **changed):
    words = {**OPTIONS, **{f"-{letter}": value for letter, value in changed.items()}}
    return box.remvol("--add", *(word for pair in words.items() for word in pair if pair[1] is not None), *more)


@pytest.fixture
def connected(site):
    """The target is logged in and its LUN 0 is the disk sdb with an ext4 file system."""
    site.offer("iqn.t1", {0: "sdb"})
    site.log_in("iqn.t1")
    return site


# What becomes of a volume that is added: what the platform says of its disk, what goes wrong, and state, text, exit
# status and result.
MOUNTS = {
    "unsupported": ({"fs": "reiserfs"}, [], "5", "Unsupported File System", 255, "-1"),
    "read-only": ({}, [fake("chmod", status=1)], "0", "Running ( Read Only )", 255, "-1"),
    "too small": ({"size": 1 << 20}, [], "2", "Offline", 0, "0"),
    "never took hold": ({}, [fake("mount", status=32)], "0", "No Format", 0, "0"),
}
FAILURES = {
    "no partition": ({"parts": 0}, hook("sys_create_1_partition", "/dev/sdb", ret=1)),
    "no usable node": ({}, hook("sys_check_dev", "/dev/sdb1", ret=-1, first=True)),
    "format": ({"fs": ""}, fake("dd", status=1)),
    "mount point": ({}, fake("mkdir", status=1)),
    "tree": ({}, hook("ktreec_set", "/iscsi/initiator/id:1/lun/id:1/format_state", ret=-1)),
}


class TestUnconnectedTarget:
    def test_a_new_volume_is_stored_and_its_node_record_written(self, site, box):
        done = add(box)
        assert (done.status, done.stdout) == (0, "\n")
        assert settings(box) == {
            "/iscsi/initiator/id:1/target": "iqn.t1",
            "/iscsi/initiator/id:1/chap": "0",
            "/iscsi/initiator/id:1/chap_name": "",
            "/iscsi/initiator/id:1/chap_pwd": "",
            "/iscsi/initiator/id:1/ip": "10.9.0.2",
            "/iscsi/initiator/id:1/port": "3260",
            "/iscsi/initiator/id:1/lun/id:1/lun": "0",
            "/iscsi/initiator/id:1/lun/id:1/share": "data",
            "/iscsi/initiator/id:1/lun/id:1/enable": "1",
            "/iscsi/initiator/id:1/lun/id:1/vol_access_right": "1",
            "/iscsi/initiator/id:1/lun/id:1/status": "Offline",
            "/iscsi/initiator/id:1/lun/id:1/size": "0/0",
            "/iscsi/initiator/id:1/lun/count": "1",
            "/iscsi/initiator/id:1/status": "Disconnected",
            "/iscsi/initiator/id:1/conn_state": "0",
            "/iscsi/initiator/total_lun_count": "1",
            "/iscsi/initiator/count": "1",
        }
        assert box.tree.get("/result/add") == "0"

    def test_the_steps_come_in_their_order(self, site, box):
        add(box)
        assert_order(
            site.trace(),
            "set /result/add=",
            "set id:1/target=iqn.t1",
            "set id:1/lun/id:1/lun=0",
            "set id:1/lun/count=1",
            "set id:1/lun/id:1/status=Offline",
            "set id:1/status=Disconnected",
            f"system {SESSIONS}",
            f"system {RECORD} delete",
            f"system {RECORD} new",
            f"system {RECORD} update -n node.session.auth.authmethod -v None",
            "set count=1",
            "set /result/add=0",
            "dump /etc/NAS_CFG/vv.xml",
            'system flashrun "cp -f /etc/NAS_CFG/vv.xml /usr/local/config/"',
            f"system {SHARES}",
        )

    def test_it_is_not_logged_in_nor_mounted(self, site, box):
        site.offer("iqn.t1", {0: "sdb"})
        assert add(box).status == 0
        assert not any("--login" in line or "mount" in line for line in box.shell())
        assert site.lun("volume_state") is None

    def test_a_failed_node_record_does_not_matter(self, site, box):
        box.fake("iscsiadm", "-m node", status=6)
        assert add(box).status == 0
        assert site.target("status") == "Disconnected"

    def test_chap_settings_are_stored_and_written_into_the_record(self, site, box):
        assert add(box, "-c", "1", "-U", "user", "-P", "secret secret").status == 0
        assert [site.target(key) for key in ("chap", "chap_name", "chap_pwd")] == ["1", "user", "secret secret"]
        assert any(line.endswith('-n node.session.auth.password -v "secret secret"') for line in box.shell())

    def test_chap_options_before_the_switch_are_dropped(self, site, box):
        assert add(box, "-U", "user", "-P", "secret", "-c", "0").status == 0
        assert site.target("chap_name") == ""

    def test_a_second_lun_goes_to_the_same_slot(self, site, box):
        assert [add(box).status, add(box, l="5", s="more").status] == [0, 0]
        assert (site.lun("lun", 2), site.lun("share", 2)) == ("5", "more")
        assert (site.target("lun/count"), site.tree.get("/iscsi/initiator/count")) == ("2", "1")

    def test_a_known_target_gets_its_new_address(self, site, box):
        site.store("iqn.t1", ip="10.9.0.9", luns=[("a", 3)])
        assert add(box).status == 0
        assert (site.target("ip"), site.target("target", 2)) == ("10.9.0.2", None)

    def test_the_start_and_end_are_logged(self, site, box):
        site.debug(2)
        lines = add(box).lines
        assert any(":task_add:" in line and line.endswith("): start") for line in lines)
        assert any(":task_add:" in line and line.endswith("): end") for line in lines)


class TestConnectedTarget:
    def test_the_lun_is_mounted_at_once(self, connected, box):
        connected.disk("sdb")
        assert add(box).status == 0
        assert_order(
            connected.trace(),
            "set id:1/lun/id:1/status=Offline",
            "set id:1/status=Connected",
            f"system {SESSIONS}",
            f"system {DETAILS}",
            "set id:1/lun/id:1/dev=",
            "set id:1/lun/id:1/dev=sdb",
            "set id:1/lun/id:1/volume_state=1",
            'system mount -t ext4 /dev/sdb1 "/mnt/VV/data"',
            "set id:1/lun/id:1/mnt_dev=/dev/sdb1",
            "set id:1/lun/id:1/volume_state=0",
            "set id:1/lun/id:1/status=Running",
            "set count=1",
            "set /result/add=0",
        )
        assert connected.mounted("data")
        assert not any("-m node" in line for line in box.shell())

    def test_the_shares_are_reloaded_once_at_the_end(self, connected, box):
        connected.disk("sdb")
        add(box)
        assert box.shell().count(SHARES) == 1 and box.shell()[-1] == SHARES

    @pytest.mark.parametrize("disk, wrong, state, text, status, result", MOUNTS.values(), ids=MOUNTS)
    def test_what_a_mount_result_means(self, connected, box, disk, wrong, state, text, status, result):
        connected.disk("sdb", **disk)
        set_up(connected, wrong)
        done = add(box)
        assert (done.status, box.tree.get("/result/add")) == (status, result)
        assert (connected.lun("volume_state"), connected.lun("status")) == (state, text)
        assert connected.tree.get("/iscsi/initiator/count") == "1"
        assert ("execute failed." in done.lines) == (status != 0)
        dumped = "dump /etc/NAS_CFG/vv.xml" in connected.trace()
        assert dumped == (status == 0)

    @pytest.mark.parametrize("disk, broken", FAILURES.values(), ids=FAILURES)
    def test_any_other_failure_ends_the_command_before_the_count(self, connected, box, disk, broken):
        connected.disk("sdb", **disk)
        broken(connected)
        assert add(box).status == 255
        assert connected.lun("volume_state") == "3"
        assert connected.lun("share") == "data"
        assert connected.trace()[-1] == "set /result/add=-1"
        assert connected.tree.get("/iscsi/initiator/count") is None

    def test_a_failed_mount_refreshes_the_status(self, connected, box):
        connected.disk("sdb")
        box.hook("sys_check_dev", "/dev/sdb1", ret=-1, first=True)
        add(box)
        assert_order(connected.trace(), "set id:1/lun/id:1/volume_state=3",
                     "set id:1/lun/id:1/status=Create Volume Failed")

    def test_a_lun_that_the_session_does_not_show_fails(self, connected, box):
        assert add(box, l="4").status == 255
        assert (connected.lun("volume_state"), connected.lun("status")) == ("3", "Offline")

    def test_a_failed_session_listing_counts_as_connected(self, site, box):
        box.fake("iscsiadm", "-m session", status=6)
        done = add(box)
        assert done.status == 255
        assert not any("-m node" in line for line in box.shell())
        assert site.lun("volume_state") == "3"

    def test_a_disabled_lun_is_left_alone(self, connected, box):
        box.hook("ktreec_get_wb", "/iscsi/initiator/id:1/lun/id:1/enable", ret=1, out="0")
        assert add(box).status == 0
        assert connected.lun("volume_state") is None

    @pytest.mark.parametrize("left", ["", "1"])
    def test_an_unreadable_enable_is_kept_as_the_result(self, connected, box, left):
        box.hook("ktreec_get_wb", "/iscsi/initiator/id:1/lun/id:1/enable", ret=-1, out=left)
        assert add(box).status == 255
        assert connected.lun("volume_state") is None
        assert connected.tree.get("/iscsi/initiator/count") == "1"

    def test_a_lun_entry_that_is_gone_again_is_not_mounted(self, connected, box):
        connected.disk("sdb")
        box.hook("system", DETAILS, through=True,
                 effect="ktreec -S /var/run/ktree_sock_vv -d /iscsi/initiator/id:1/lun/id:1")
        assert add(box).status == 0
        assert connected.tree.get("/iscsi/initiator/count") == "1"
        assert not any(line.startswith("mount") for line in box.shell())


class TestRefusals:
    def refused(self, box, message, **changed):
        before = settings(box)
        done = add(box, **changed)
        assert done.status == 255
        assert messages(done) == ([message] if message else [])
        assert box.tree.get("/result/add") == "-1"
        assert box.shell() == ["winshare_reload"]
        return before, settings(box)

    def test_the_same_lun_again_is_refused_before_its_share_name_is_looked_at(self, site, box):
        site.store("iqn.t1", luns=[("data", 0)])
        before, after = self.refused(box, "")
        assert after == before

    @pytest.mark.parametrize("known", [True, False])
    def test_a_used_share_name(self, site, box, known):
        site.store("iqn.t1", luns=[("data", 7)])
        before, after = self.refused(box, "share name data has benn used", n="iqn.t1" if known else "iqn.t2")
        if known:
            assert after == before
        else:
            # The target stays; nothing counts it until the next command that does.
            assert site.target("target", 2) == "iqn.t2"
            assert site.lun("lun", target=2) is None
            assert site.tree.get("/iscsi/initiator/count") == "1"

    def test_share_names_differ_in_case_and_length(self, site, box):
        site.store("iqn.t1", luns=[("Data", 7), ("data1", 8), ("dat", 9)])
        assert add(box).status == 0

    def test_a_ninth_lun_in_the_system(self, site, box):
        for slot, shares in enumerate((["a", "b", "c"], ["d", "e", "f"], ["g", "h"]), start=1):
            site.store(f"iqn.t{slot}", slot=slot, luns=[(share, n) for n, share in enumerate(shares, start=1)])
        before, after = self.refused(box, "can not add target iqn.t3 with lun 0", n="iqn.t3")
        assert after == before

    def test_a_ninth_target(self, site, box):
        for slot in range(1, 9):
            site.store(f"iqn.t{slot}", slot=slot)
        before, after = self.refused(box, "ktree_get_free_dbidx() failed", n="iqn.t9")
        assert after == before

    @pytest.mark.parametrize("key", ["target", "chap", "chap_name", "chap_pwd", "ip", "port"])
    def test_a_target_that_the_tree_does_not_take(self, site, box, key):
        box.hook("ktreec_set", f"/iscsi/initiator/id:1/{key}", ret=-1)
        self.refused(box, "ktreec_set() failed")
        assert site.lun("lun") is None

    @pytest.mark.parametrize("key", ["lun", "share", "enable", "vol_access_right"])
    def test_a_lun_that_the_tree_does_not_take(self, site, box, key):
        box.hook("ktreec_set", f"/iscsi/initiator/id:1/lun/id:1/{key}", ret=-1)
        done = add(box)
        assert done.status == 255
        assert messages(done) == ["ktreec_set() failed", "can not add target iqn.t1 with lun 0"]
        order = ["lun", "share", "enable", "vol_access_right"]
        stored = [name for name in order if site.lun(name) is not None]
        assert stored == order[:order.index(key)]


class TestBadInput:
    @pytest.mark.parametrize("letter", OPTIONS)
    def test_a_missing_option(self, site, box, letter):
        site.debug(1)
        before = settings(box)
        done = add(box, **{letter[1]: None})
        missing = {"-n": 0x01, "-i": 0x04, "-p": 0x08, "-s": 0x20, "-l": 0x40}[letter]
        assert done.status == 255
        assert f"OPT_FLAG: {0x6d & ~missing:08x}" in messages(done)[-1]
        assert "task_add() failed" not in done.stdout
        assert settings(box) == before
        assert box.tree.get("/result/add") == "-1"

    @pytest.mark.parametrize("changed", [{"n": ""}, {"p": "-1"}, {"c": "1"}, {"c": "2"}])
    def test_settings_that_no_target_can_have(self, site, box, changed):
        done = add(box, **changed)
        assert (done.status, messages(done)) == (255, [])
        assert settings(box) == {}

    @pytest.mark.parametrize("address", ["", "no such host", "10.9.0"])
    def test_an_address_that_cannot_be_resolved(self, site, box, address):
        box.hook("getaddrinfo", address, ret=-2)
        done = add(box, i=address)
        assert (done.status, messages(done)) == (255, [f"ip address {address} -> error"])
        assert settings(box) == {}

    def test_the_longest_names_are_stored_whole(self, site, box):
        assert add(box, n="x" * 255, s="y" * 127).status == 0
        assert (site.target("target"), site.lun("share")) == ("x" * 255, "y" * 127)

    @pytest.mark.parametrize("long", [{"n": "x" * 256}, {"s": "y" * 128}])
    def test_a_longer_name_is_refused_not_cut(self, site, box, long):
        assert add(box, **long).status == 255
        assert site.target("target") is None


class TestCheckShareName:
    @pytest.mark.parametrize("name, used", [("data", 1), ("Data", 0), ("dat", 0), ("data1", 0), ("", 0)])
    def test_the_answer_is_the_exit_status_and_the_result(self, site, box, name, used):
        site.store("iqn.t1", luns=[("first", 0)])
        site.store("iqn.t2", slot=2, luns=[("other", 0), ("data", 1)])
        done = box.remvol("--check_share_name", "-s", name)
        assert (done.status, done.stdout) == (used, "\n")
        assert box.tree.get("/result/check_share_name") == str(used)
        assert "dump /etc/NAS_CFG/vv.xml" in site.trace()

    @pytest.mark.parametrize("name, text", [("data", "share name data is not ok"), ("new", "share name new is ok")])
    def test_it_says_so_in_the_log(self, site, box, name, text):
        site.store("iqn.t1", luns=[("data", 0)])
        site.debug(2)
        lines = messages(box.remvol("--check_share_name", "-s", name))
        assert lines.index("start") < lines.index(text) < lines.index("end")

    def test_without_a_name(self, site, box):
        assert box.remvol("--check_share_name").status == 255
        assert box.tree.get("/result/check_share_name") == "-1"


class TestReadThatFails:
    """One read of the tree, the first or a later one, gives nothing: it looks like a slot that is free."""

    @pytest.fixture
    def three(self, site):
        for n, name in enumerate(("iqn.t1", "iqn.t2", "iqn.t3"), 1):
            site.store(name, slot=n, luns=[(f"{name[-2:]}a", 0), (f"{name[-2:]}b", 1)])
        return site

    def stored(self, box):
        slots = {path: value for path, value in settings(box).items() if path.endswith(("/target", "/lun", "/share"))}
        return {path.removeprefix("/iscsi/initiator/"): value for path, value in slots.items()}

    def failing(self, box, key, skip):
        box.hook("ktreec_get_wb", f"/iscsi/initiator/{key}", ret=-1, skip=skip, times=1)

    @pytest.mark.parametrize("key", ["id:1/target", "id:2/target", "id:3/target"])
    @pytest.mark.parametrize("skip", range(5))
    def test_a_new_target_takes_no_slot_that_is_taken(self, three, box, key, skip):
        before = self.stored(box)
        self.failing(box, key, skip)
        done = add(box, n="iqn.t4")
        new = {"id:4/target": "iqn.t4", "id:4/lun/id:1/lun": "0", "id:4/lun/id:1/share": "data"}
        assert self.stored(box) == (before if done.status else {**before, **new})

    @pytest.mark.parametrize("key", ["id:1/target", "id:2/target", "id:2/lun/id:1/lun", "id:2/lun/id:2/lun"])
    @pytest.mark.parametrize("skip", range(6))
    def test_a_stored_target_is_not_stored_twice(self, three, box, key, skip):
        before = self.stored(box)
        self.failing(box, key, skip)
        done = add(box, n="iqn.t2", l="2")
        new = {"id:2/lun/id:3/lun": "2", "id:2/lun/id:3/share": "data"}
        assert self.stored(box) == (before if done.status else {**before, **new})
        assert done.status or (three.target("lun/count", 2), box.tree.get("/iscsi/initiator/count")) == ("3", "3")

    @pytest.mark.parametrize("key", ["id:2/lun/id:1/lun", "id:2/lun/id:2/lun"])
    @pytest.mark.parametrize("skip", range(3))
    def test_a_stored_lun_is_not_stored_twice(self, three, box, key, skip):
        before = self.stored(box)
        self.failing(box, key, skip)
        assert add(box, n="iqn.t2", l="1").status == 255
        assert self.stored(box) == before

    @pytest.mark.parametrize("key", ["id:2/lun/id:1/share", "id:2/lun/id:2/share"])
    @pytest.mark.parametrize("skip", range(3))
    def test_a_share_name_is_not_given_twice(self, three, box, key, skip):
        before = self.stored(box)
        self.failing(box, key, skip)
        assert add(box, n="iqn.t1", l="2", s="t2b").status == 255
        assert self.stored(box) == before


class TestHalfStoredLun:
    """What an --add that was killed between its values has left is completed by the same --add, which is refused."""

    @pytest.fixture
    def half(self, site, box):
        site.store("iqn.t1", luns=[("a", 0), ("data", 1)])
        box.tree.delete("/iscsi/initiator/id:1/lun/id:2/enable")
        box.tree.delete("/iscsi/initiator/id:1/lun/id:2/vol_access_right")
        box.tree.set("/iscsi/initiator/id:1/lun/count", 1)
        box.tree.set("/iscsi/initiator/total_lun_count", 1)
        return site

    def test_it_is_completed(self, half, box):
        assert add(box, l="1").status == 255
        assert (half.lun("enable", 2), half.lun("vol_access_right", 2), half.target("lun/count")) == ("1", "1", "2")
        assert box.tree.get("/iscsi/initiator/total_lun_count") == "2"

    def test_under_another_share_name_it_stays(self, half, box):
        assert add(box, l="1", s="other").status == 255
        assert (half.lun("enable", 2), half.lun("share", 2), half.target("lun/count")) == (None, "data", "1")

    def test_a_volume_that_was_disabled_stays_so(self, site, box):
        site.store("iqn.t1", luns=[("data", 0, {"enable": 0, "vol_access_right": 0})])
        box.forget()
        assert add(box).status == 255
        assert (site.lun("enable"), site.lun("vol_access_right")) == ("0", "0")
