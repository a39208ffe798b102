"""--del and --del_lun."""

import pytest

from appliance import SLOTS_MOVE, assert_order, settings
from harness import messages
from harness.initiator import SHARES

LOGOUT = 'iscsiadm -m node -T "iqn.t1" --logout'
DELETED = "ktreec -S /var/run/ktree_sock_vv -d /iscsi/initiator/id:1"
# Shell text: the tree's daemon is gone behind it.
TREE_ENDS = ("kill -KILL $(cat /var/run/ktree_sock_vv_config.pid); "
             "until ktreec -S /var/run/ktree_sock_vv -t >/dev/null 2>&1; [ $? -eq 3 ]; do sleep 0.01; done")
RECORD_DELETE = "iscsiadm -m node -I default -T iqn.t1 -p 10.9.0.2:3260 -o delete"


@pytest.fixture
def mounted(site, box):
    """A connected target with three mounted LUNs, and a second target behind it."""
    site.store("iqn.t1", conn_set=1, conn_state=1,
               luns=[(share, number, {"dev": f"sd{share}", "mnt_dev": f"/dev/sd{share}1", "mnt": f"/mnt/VV/{share}"})
                     for number, share in enumerate("xyz")])
    site.store("iqn.t2", slot=2, luns=[("other", 0)])
    site.offer("iqn.t1", {0: "sdx", 1: "sdy", 2: "sdz"})
    site.log_in("iqn.t1")
    box.hook("sys_get_fs_type", "", ret=1)
    for share in "xyz":
        site.disk(f"sd{share}")
        site.mount(f"sd{share}", f"/mnt/VV/{share}")
    box.forget()
    return site


class TestTarget:
    def test_the_steps_come_in_their_order(self, mounted, box):
        done = box.remvol("--del", "-n", "iqn.t1")
        assert (done.status, box.tree.get("/result/del")) == (0, "0")
        assert_order(
            mounted.trace(),
            "set /result/del=",
            f"system {SHARES}",
            f"system {SHARES}",
            f"system {SHARES}",
            'system umount -f "/mnt/VV/x"',
            'system umount -f "/mnt/VV/y"',
            'system umount -f "/mnt/VV/z"',
            f"system {SHARES}",
            f"system {LOGOUT}",
            "set id:1/conn_set=0",
            f"system {RECORD_DELETE}",
            "del id:1",
            "set count=1",
            "set /result/del=0",
            "dump /etc/NAS_CFG/vv.xml",
            'system flashrun "cp -f /etc/NAS_CFG/vv.xml /usr/local/config/"',
            f"system {SHARES}",
        )
        assert box.shell().count(SHARES) == 5
        assert not mounted.logged_in("iqn.t1")
        assert not any(mounted.mounted(share) for share in "xyz")

    def test_the_target_behind_it_moves_up(self, mounted, box):
        box.remvol("--del", "-n", "iqn.t1")
        assert (mounted.target("target"), mounted.lun("share")) == ("iqn.t2", "other")
        assert mounted.target("target", 2) is None

    def test_the_record_of_an_ipv6_portal_goes_with_its_interface(self, site, box):
        site.store("iqn.t1", ip="[fe80::2]")
        box.hook("LIB_Get_Lan_Link_Speed", "0", ret=0)
        box.hook("LIB_Get_Lan_Link_Speed", "1", ret=0)
        assert box.remvol("--del", "-n", "iqn.t1").status == 0
        assert "iscsiadm -m node -I iface0 -T iqn.t1 -p [fe80::2]:3260 -o delete" in box.shell()

    def test_nothing_that_fails_on_the_way_stops_it(self, site, box):
        site.store("iqn.t1", luns=[("a", 0)])
        box.fake("iscsiadm", "-m node", status=6)
        done = box.remvol("--del", "-n", "iqn.t1")
        assert done.status == 0
        assert messages(done) == [f"system() of cmd '{line}' failed" for line in (LOGOUT, RECORD_DELETE)]
        assert messages(done, "Target_Config_Gen") == [f"system() of cmd '{RECORD_DELETE}' failed"]
        assert settings(box) == {"/iscsi/initiator/count": "0"}

    def test_a_target_without_a_portal_has_no_record_to_delete(self, site, box):
        site.store("iqn.t1", ip="")
        assert box.remvol("--del", "-n", "iqn.t1").status == 0
        assert not any("-o delete" in line for line in box.shell())
        assert site.target("target") is None

    @pytest.mark.parametrize("failures", [1, 3, 4])
    def test_the_slot_is_deleted_in_four_tries(self, site, box, failures):
        site.store("iqn.t1")
        box.hook("ktreec_del", "/iscsi/initiator/id:1", ret=-1, times=failures)
        done = box.remvol("--del", "-n", "iqn.t1")
        said = [line for line in messages(done) if line.startswith("ktreec_del")]
        assert said == ["ktreec_del() of path '/iscsi/initiator/id:1' failed"] * failures
        assert done.status == (255 if failures == 4 else 0)
        trace = site.trace()
        assert trace.count("del id:1") == min(failures + 1, 4)
        last = len(trace) - trace[::-1].index("del id:1")
        assert trace[trace.index("del id:1"):last] == ["del id:1"] * min(failures + 1, 4)
        assert_order(trace, "del id:1", f"set count={1 if failures == 4 else 0}")

    def test_a_slot_that_is_deleted_though_the_answer_is_lost_is_deleted_once(self, site, box):
        site.store("iqn.t1")
        site.store("iqn.t2", slot=2)
        box.hook("ktreec_del", "/iscsi/initiator/id:1", ret=-1, times=1, effect=DELETED)
        assert box.remvol("--del", "-n", "iqn.t1").status == 0
        assert (site.target("target"), site.target("target", 2)) == ("iqn.t2", None)

    def test_a_tree_that_tells_nothing_any_more_is_not_asked_again(self, site, box):
        """Requests that wait are carried out later, and what has moved into the slot would be deleted by a further one."""
        site.store("iqn.t1")
        site.store("iqn.t2", slot=2)
        box.hook("ktreec_del", "/iscsi/initiator/id:1", ret=-1, times=1,
                 effect=TREE_ENDS)
        assert box.remvol("--del", "-n", "iqn.t1").status == 255
        assert site.trace().count("del id:1") == 1

    @pytest.mark.parametrize("name", ["iqn.t3", "iqn.t", "", "x" * 255])
    def test_an_unknown_target_refreshes_the_count_alone(self, site, box, name):
        site.store("iqn.t1", luns=[("a", 0)])
        site.tree.set("/iscsi/initiator/count", 7)
        site.debug(1)
        before = settings(box)
        done = box.remvol("--del", "-n", name)
        assert done.status == 255
        assert f"Can not find: {name[:255]}" in messages(done)
        assert settings(box) == {**before, "/iscsi/initiator/count": "1"}
        assert box.shell() == ["winshare_reload"]
        assert box.tree.get("/result/del") == "-1"

    def test_no_name(self, site, box):
        site.store("iqn.t1")
        before = settings(box)
        assert box.remvol("--del").status == 255
        assert settings(box) == before


class TestLun:
    def test_the_middle_one_of_three(self, mounted, box):
        done = box.remvol("--del_lun", "-n", "iqn.t1", "-l", "1")
        assert (done.status, box.tree.get("/result/del_lun")) == (0, "0")
        assert_order(
            mounted.trace(),
            "set /result/del_lun=",
            f"system {SHARES}",
            'system umount -f "/mnt/VV/y"',
            'system rm -rf "/mnt/VV/y"',
            "del id:1/lun/id:2",
            "set id:1/lun/count=2",
            "set total_lun_count=3",
            "set /result/del_lun=0",
            "dump /etc/NAS_CFG/vv.xml",
            f"system {SHARES}",
        )
        assert [mounted.lun("share", n) for n in (1, 2, 3)] == ["x", "z", None]
        assert [mounted.mounted(share) for share in "xyz"] == [True, False, True]
        assert mounted.logged_in("iqn.t1")

    def test_the_last_one_takes_its_target_along(self, site, box):
        site.store("iqn.t1", luns=[("a", 3)])
        site.debug(2)
        done = box.remvol("--del_lun", "-n", "iqn.t1", "-l", "3")
        assert done.status == 0
        assert_order(messages(done), "start", "removing target iqn.t1", "start", "end", "end, ret = 0")
        assert_order(site.trace(), f"system {LOGOUT}", f"system {RECORD_DELETE}", "del id:1", "set count=0")
        assert not any("lun/count" in line or "total_lun_count" in line for line in site.trace())
        assert site.target("target") is None

    def test_the_failure_to_delete_the_last_ones_target(self, site, box):
        site.store("iqn.t1", luns=[("a", 3)])
        site.debug(2)
        box.hook("ktreec_del", "/iscsi/initiator/id:1", ret=-1)
        done = box.remvol("--del_lun", "-n", "iqn.t1", "-l", "3")
        assert (done.status, messages(done)[-2:]) == (255, ["end, ret = 2", "task_del_lun() failed"])

    @pytest.mark.parametrize("failures", [1, 3, 4])
    def test_the_slot_is_deleted_in_four_tries(self, site, box, failures):
        site.store("iqn.t1", luns=[("a", 0), ("b", 1)])
        box.hook("ktreec_del", "/iscsi/initiator/id:1/lun/id:1", ret=-1, times=failures)
        done = box.remvol("--del_lun", "-n", "iqn.t1", "-l", "0")
        assert messages(done) == ["ktreec_del() of path '/iscsi/initiator/id:1/lun/id:1' failed"] * failures
        assert done.status == (255 if failures == 4 else 0)
        assert site.trace().count("del id:1/lun/id:1") == min(failures + 1, 4)
        assert_order(site.trace(), "del id:1/lun/id:1", f"set id:1/lun/count={2 if failures == 4 else 1}")

    def test_a_slot_that_is_deleted_though_the_answer_is_lost_is_deleted_once(self, site, box):
        site.store("iqn.t1", luns=[("a", 0), ("b", 1), ("c", 2)])
        box.hook("ktreec_del", "/iscsi/initiator/id:1/lun/id:1", ret=-1, times=1, effect=f"{DELETED}/lun/id:1")
        assert box.remvol("--del_lun", "-n", "iqn.t1", "-l", "0").status == 0
        assert [site.lun("share", n) for n in (1, 2, 3)] == ["b", "c", None]

    def test_a_tree_that_tells_nothing_any_more_is_not_asked_again(self, site, box):
        site.store("iqn.t1", luns=[("a", 0), ("b", 1)])
        box.hook("ktreec_del", "/iscsi/initiator/id:1/lun/id:1", ret=-1, times=1,
                 effect=TREE_ENDS)
        assert box.remvol("--del_lun", "-n", "iqn.t1", "-l", "0").status == 255
        assert site.trace().count("del id:1/lun/id:1") == 1

    def test_a_failed_unmount_does_not_stop_it(self, mounted, box):
        box.fake("rm", status=1)
        assert box.remvol("--del_lun", "-n", "iqn.t1", "-l", "1").status == 0
        assert mounted.lun("share", 2) == "z"

    @pytest.mark.parametrize("number", ["-1", "-2147483648"])
    def test_a_negative_number(self, site, box, number):
        site.store("iqn.t1", luns=[("a", 0), ("b", 1)])
        self.refused(site, box, ["lun is not given"], "iqn.t1", number, None)

    @pytest.mark.parametrize("name", ["iqn.t2", "", "x" * 255])
    def test_an_unknown_target_refreshes_no_count(self, site, box, name):
        site.store("iqn.t1", luns=[("a", 0), ("b", 1)])
        self.refused(site, box, [f"Can not find: {name[:255]}"], name, "0", None)

    @pytest.mark.parametrize("number", ["2", "99999"])
    def test_an_unknown_lun_refreshes_the_counts_alone(self, site, box, number):
        site.store("iqn.t1", luns=[("a", 0), ("b", 1)])
        self.refused(site, box, [f"Can not find lun {number} under target iqn.t1"], "iqn.t1", number, "2")

    def refused(self, site, box, said, name, number, count):
        site.tree.set("/iscsi/initiator/id:1/lun/count", 7)
        site.tree.set("/iscsi/initiator/total_lun_count", 7)
        before = settings(box)
        done = box.remvol("--del_lun", "-n", name, "-l", number)
        assert (done.status, messages(done)) == (255, said)
        counts = {f"/iscsi/initiator/{key}": count for key in ("id:1/lun/count", "total_lun_count") if count}
        assert settings(box) == {**before, **counts}
        assert box.shell() == ["winshare_reload"]
        assert box.tree.get("/result/del_lun") == "-1"

    def test_an_entry_that_cannot_be_read(self, site, box):
        site.store("iqn.t1", luns=[("a", 0), ("b", 1)])
        # The name is read by the look-up of the slot, by the two walks of the count, then by the entry.
        box.hook("ktreec_get_wb", "/iscsi/initiator/id:1/target", through=True, effect=SLOTS_MOVE)
        box.hook("ktreec_get_wb", "/iscsi/initiator/id:1/lun/id:1/lun", ret=-1, skip=2, times=2)
        done = box.remvol("--del_lun", "-n", "iqn.t1", "-l", "0")
        assert done.status == 255
        assert messages(done)[-1] == "Can not get lun entry 0 under target iqn.t1"
        assert (site.lun("share"), site.target("lun/count")) == ("a", "2")
        assert box.shell() == ["winshare_reload"]

    @pytest.mark.parametrize("slot, skip", [(1, 0), (1, 1), (1, 2), (1, 3), (1, 4), (1, 5), (2, 0), (2, 1), (2, 2), (2, 3)])
    def test_a_read_that_fails_deletes_no_other_lun(self, mounted, box, slot, skip):
        box.hook("ktreec_get_wb", f"/iscsi/initiator/id:1/lun/id:{slot}/lun", ret=-1, skip=skip, times=1)
        box.remvol("--del_lun", "-n", "iqn.t1", "-l", "0")
        assert {"y", "z"} <= {mounted.lun("share", n) for n in (1, 2, 3)}
        assert mounted.logged_in("iqn.t1") and mounted.mounted("y") and mounted.mounted("z")

    @pytest.mark.parametrize("skip", range(0, 64))
    def test_a_tree_that_cannot_be_read_any_more_does_not_say_that_the_last_lun_is_gone(self, site, box, skip):
        site.store("iqn.t1", luns=[("a", 0)])
        site.store("iqn.t2", slot=2, luns=[("b", 0)])
        box.hook("ktreec_get_wb", ret=-1, skip=skip)
        done = box.remvol("--del_lun", "-n", "iqn.t1", "-l", "0")
        assert done.status == 255 or site.target("target") == "iqn.t2" or site.lun("share") is None
        assert "iqn.t2" in (site.target("target"), site.target("target", 2))

    def test_nothing_is_said_of_what_is_only_looked_at(self, site, box):
        site.store("iqn.t1", luns=[("a", 0), ("b", 1)])
        site.debug(1)
        said = messages(box.remvol("--del_lun", "-n", "iqn.t1", "-l", "7"))
        assert said[-5:] == ["get iqn.t1 db_idx=1", "ktreec_get(/iscsi/initiator/id:1/lun/id:3/lun) failed",
                             "get lun: 7 at db_idx=-1", "Can not find lun 7 under target iqn.t1", "task_del_lun() failed"]
        assert said.count("get iqn.t1 db_idx=1") == 1

    @pytest.mark.parametrize("options", [["-n", "iqn.t1"], ["-l", "0"], []])
    def test_a_missing_option(self, site, box, options):
        site.store("iqn.t1", luns=[("a", 0), ("b", 1)])
        before = settings(box)
        done = box.remvol("--del_lun", *options)
        assert (done.status, messages(done)) == (255, [])
        assert settings(box) == before

    def test_the_result_is_logged_at_the_end(self, site, box):
        site.store("iqn.t1", luns=[("a", 0), ("b", 1)])
        site.debug(2)
        assert "end, ret = 0" in messages(box.remvol("--del_lun", "-n", "iqn.t1", "-l", "0"))
        assert "end, ret = 1" in messages(box.remvol("--del_lun", "-n", "iqn.t1", "-l", "0"))
