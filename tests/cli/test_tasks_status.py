"""--status."""

import os
import re

import pytest

from appliance import assert_order, settings
from harness import messages
from harness.initiator import DETAILS, INITIATOR


def status(box):
    return box.remvol("--status")


class TestTargets:
    def test_every_target_gets_its_devices_and_its_texts(self, site, box):
        site.store("iqn.t1", luns=[("a", 0), ("b", 1)])
        site.store("iqn.t2", slot=2, luns=[("c", 0)])
        site.offer("iqn.t1", {0: "sdb"})
        site.log_in("iqn.t1")
        site.disk("sdb")
        done = status(box)
        assert (done.status, done.stdout) == (0, "\n")
        assert_order(
            site.trace(),
            "set /result/status=",
            f"system {DETAILS}",
            "set id:1/lun/id:1/dev=sdb",
            "set id:1/status=Connected",
            "set id:1/lun/id:1/status=No Format",
            "set id:1/lun/id:2/status=Offline",
            "set total_lun_count=3",
            f"system {DETAILS}",
            "set id:2/status=Disconnected",
            "set id:2/lun/id:1/status=Offline",
            "set total_lun_count=3",
            "set /result/status=0",
            "dump /etc/NAS_CFG/vv.xml",
        )

    def test_it_changes_no_flash_and_no_share(self, site, box):
        site.store("iqn.t1")
        status(box)
        assert not any("flashrun" in line or "reload" in line for line in box.shell())

    def test_asked_again_when_nothing_has_changed_it_writes_nothing_to_the_disk(self, site, box):
        site.store("iqn.t1", luns=[("a", 0)])
        site.offer("iqn.t1", {0: "sdb"})
        site.log_in("iqn.t1")
        site.disk("sdb")
        box.path("/etc/NAS_CFG").mkdir(exist_ok=True)
        saved = box.path("/etc/NAS_CFG/vv.xml")
        assert status(box).status == 0
        with saved.open() as before:
            assert status(box).status == 0
            assert os.path.samestat(os.stat(before.fileno()), saved.stat())
            site.tree.set(f"{INITIATOR}/id:1/lun/id:1/share", "b")
            assert status(box).status == 0
            assert not os.path.samestat(os.stat(before.fileno()), saved.stat())

    @pytest.mark.parametrize("value", [None, ""])
    def test_without_a_count(self, site, box, value):
        site.store("iqn.t1")
        site.tree.delete(f"{INITIATOR}/count")
        if value is not None:
            site.tree.set(f"{INITIATOR}/count", value)
        site.debug(1)
        before = settings(box)
        done = status(box)
        assert done.status == 255
        assert messages(done)[-1] == "task_status() failed"
        assert settings(box) == before

    def test_a_name_that_is_found_in_no_slot_is_passed_over(self, site, box):
        site.store("iqn.t2", slot=2)
        box.hook("ktreec_del", f"{INITIATOR}/id:1", ret=-1)  # the look-up of the name ends at the nameless slot
        assert status(box).status == 0
        assert (site.target("target", 2), site.target("status", 2)) == ("iqn.t2", None)

    def test_a_failed_listing_skips_its_target(self, site, box):
        site.store("iqn.t1", luns=[("a", 0)])
        site.store("iqn.t2", slot=2)
        site.debug(2)
        box.fake("iscsiadm", "-m session -P3", status=6, times=1)
        done = status(box)
        assert done.status == 0
        assert "iscsiadm -m session failed. Skip this target." in messages(done)
        assert (site.target("status"), site.lun("status")) == (None, None)
        assert site.target("status", 2) == "Disconnected"

    @pytest.mark.parametrize("slot", [1, 2])
    def test_a_failed_tree_write_ends_everything(self, site, box, slot):
        for n in (1, 2, 3):
            site.store(f"iqn.t{n}", slot=n, luns=[(f"s{n}", 0)])
            site.offer(f"iqn.t{n}", {0: f"sd{n}"})
        site.log_in("iqn.t3")
        site.debug(2)
        box.hook("ktreec_set", f"{INITIATOR}/id:{slot}/lun/id:1/dev", ret=-1)
        done = status(box)
        assert done.status == 255
        said = messages(done)
        assert "set value to ktree failed. Exit." in said
        assert said[-1] == "task_status() failed" and "end" not in said[said.index("set value to ktree failed. Exit."):]
        assert [site.target("status", n) for n in (1, 2, 3)] == ["Disconnected"] * (slot - 1) + [None] * (4 - slot)
        assert box.tree.get("/result/status") == "-1"

    def test_a_session_without_disks_is_refreshed_all_the_same(self, site, box):
        site.store("iqn.t1", luns=[("a", 0, {"dev": "sdb"})])
        site.offer("iqn.t1", {})
        site.log_in("iqn.t1")
        assert status(box).status == 0
        assert (site.target("status"), site.lun("dev"), site.lun("status")) == ("Connected", "", "Offline")


class TestLuns:
    @pytest.fixture
    def mounted(self, site):
        site.store("iqn.t1", luns=[("a", 0), ("b", 1), ("c", 2)])
        site.offer("iqn.t1", {0: "sdb", 1: "sdc", 2: "sdd"})
        site.log_in("iqn.t1")
        for dev in ("sdb", "sdc", "sdd"):
            site.disk(dev, fs="")
        return site

    @pytest.mark.parametrize(
        "format_state, text",
        [("1", "Formatting 37%"), ("0", "No Format"), ("3", "Create Volume Failed"), ("4", "Wait to Format"),
         (None, "No Format")],
    )
    def test_the_progress_shows_while_a_format_runs(self, mounted, format_state, text, box):
        box.tree.set(f"{INITIATOR}/id:1/lun/id:1/format_progress", 37)
        if format_state is not None:
            box.tree.set(f"{INITIATOR}/id:1/lun/id:1/format_state", format_state)
        assert status(box).status == 0
        assert (mounted.lun("status"), mounted.lun("status", 2)) == (text, "No Format")

    def test_a_format_shows_its_progress_without_a_device_too(self, site, box):
        site.store("iqn.t1", luns=[("a", 0, {"format_state": 1, "format_progress": 5})])
        status(box)
        assert site.lun("status") == "Formatting 5%"

    def test_the_walk_stops_at_the_first_empty_slot(self, mounted, box):
        box.tree.set(f"{INITIATOR}/id:1/lun/id:2/lun", "")
        assert status(box).status == 0
        assert [mounted.lun("status", n) for n in (1, 2, 3)] == ["No Format", None, None]

    def test_the_total_is_rewritten(self, mounted, box):
        box.tree.set(f"{INITIATOR}/total_lun_count", 77)
        status(box)
        assert box.tree.get(f"{INITIATOR}/total_lun_count") == "3"


class TestBrokenSlots:
    def broken(self, site, slot, **more):
        """A slot with a status but without a name."""
        site.tree.set({f"{INITIATOR}/id:{slot}/{key}": value for key, value in {"status": "old", **more}.items()})

    def names(self, site):
        return [site.target("target", n) for n in range(1, 9)]

    @pytest.mark.parametrize("count", [1, 0])
    def test_a_slot_that_has_got_a_name_meanwhile_stays(self, site, box, count):
        """The tree is loaded by hand, which asks for no lock, behind the first look at the slots."""
        self.broken(site, 1)
        box.tree.set(f"{INITIATOR}/count", count)
        box.hook("ktreec_get_wb", f"{INITIATOR}/count", through=True, skip=1, times=1,
                 effect=f"ktreec -S /var/run/ktree_sock_vv -s {INITIATOR}/id:1/target iqn.t1")
        assert status(box).status == 0
        assert site.target("target") == "iqn.t1"

    @pytest.fixture(params=[0, 2], ids=["uncounted", "counted"])
    def named(self, site, box, request):
        for slot in (1, 2):
            site.store(f"iqn.t{slot}", slot=slot, status="old")
        box.tree.set(f"{INITIATOR}/count", request.param)
        return site

    @pytest.mark.parametrize("slot", [1, 2])
    @pytest.mark.parametrize("skip", range(4))
    def test_a_name_that_cannot_be_read_for_a_moment_is_there(self, named, box, slot, skip):
        box.hook("ktreec_get_wb", f"{INITIATOR}/id:{slot}/target", ret=-1, skip=skip, times=4)
        assert status(box).status == 0
        assert self.names(named)[:3] == ["iqn.t1", "iqn.t2", None]

    @pytest.mark.parametrize("reads", range(16, 40))
    def test_a_tree_that_cannot_be_read_any_more_loses_no_name(self, named, box, reads):
        box.hook("ktreec_get_wb", re.compile("."), ret=-1, skip=reads)
        status(box)
        assert self.names(named)[:3] == ["iqn.t1", "iqn.t2", None]

    def test_a_slot_without_a_name_is_deleted_and_its_successor_visited_next(self, site, box):
        site.store("iqn.t1")
        self.broken(site, 2, ip="10.9.0.2")
        site.store("iqn.t3", slot=3)
        box.tree.set(f"{INITIATOR}/count", 3)
        done = status(box)
        assert (done.status, messages(done)) == (0, [])
        assert site.trace().count("del id:2") == 1
        assert self.names(site)[:3] == ["iqn.t1", "iqn.t3", None]
        assert site.target("status", 2) == "Disconnected"

    def test_no_more_slots_are_visited_than_were_counted(self, site, box):
        self.broken(site, 1)
        site.store("iqn.t2", slot=2)
        site.store("iqn.t3", slot=3)
        box.tree.set(f"{INITIATOR}/count", 2)
        assert status(box).status == 0
        assert self.names(site)[:3] == ["iqn.t2", "iqn.t3", None]
        assert (site.target("status", 1), site.target("status", 2)) == ("Disconnected", None)

    def test_an_empty_name_is_no_name(self, site, box):
        site.store("")
        site.store("iqn.t2", slot=2)
        assert status(box).status == 0
        assert self.names(site)[:2] == ["iqn.t2", None]

    def test_a_failed_deletion_is_logged_and_passed_over(self, site, box):
        self.broken(site, 1)
        site.store("iqn.t2", slot=2)
        box.hook("ktreec_del", f"{INITIATOR}/id:1", ret=-1)
        done = status(box)
        assert (done.status, messages(done)[0]) == (0, f"ktreec_del() of path '{INITIATOR}/id:1' failed")
        assert site.trace().count("del id:1") == 1
        assert site.target("ip", 2) == "10.9.0.2"

    def test_a_count_above_the_slots_that_are_there(self, site, box):
        site.store("iqn.t1")
        box.tree.set(f"{INITIATOR}/count", 3)
        done = status(box)
        assert done.status == 0
        assert site.target("status") == "Disconnected"
        assert messages(done) == [f"ktreec_del() of path '{INITIATOR}/id:{n}' failed" for n in (2, 3)]
        assert box.tree.get(f"{INITIATOR}/count") == "1"

    @pytest.mark.parametrize("count", ["2147483647", "99999999999999999999"])
    def test_a_senseless_count_ends_all_the_same(self, site, box, count):
        site.store("iqn.t1")
        box.tree.set(f"{INITIATOR}/count", count)
        assert status(box).status == 0

    @pytest.mark.parametrize("count", ["0", "-5", "none"])
    def test_nothing_counted(self, site, box, count):
        site.store("iqn.t1")
        box.tree.set(f"{INITIATOR}/count", count)
        assert status(box).status == 0
        assert site.target("status") is None
        assert DETAILS not in box.shell()

    def test_slots_behind_the_count_that_have_a_status_but_no_name_are_removed(self, site, box):
        box.tree.set(f"{INITIATOR}/count", 0)
        for slot in range(1, 9):
            self.broken(site, slot)
        done = status(box)
        assert done.status == 0
        assert [line.split("/")[-1] for line in messages(done)] == ["id:1'"] * 8
        assert all(line.startswith("ktreec_del() of path '/iscsi") and line.endswith("'") for line in messages(done))
        assert site.target("status") is None

    def test_a_named_slot_behind_the_count_is_left(self, site, box):
        site.store("iqn.t1")
        site.store("iqn.t2", slot=2, status="old")
        self.broken(site, 3)
        box.tree.set(f"{INITIATOR}/count", 1)
        assert status(box).status == 0
        assert (site.target("target", 2), site.target("status", 2)) == ("iqn.t2", "old")
        assert site.target("status", 3) is None

    def test_the_search_behind_the_count_stops_at_a_slot_without_a_status(self, site, box):
        site.store("iqn.t1")
        site.tree.set(f"{INITIATOR}/id:2/ip", "10.9.0.2")
        self.broken(site, 3)
        box.tree.set(f"{INITIATOR}/count", 1)
        assert status(box).status == 0
        assert site.target("status", 3) == "old"

    def test_a_failed_deletion_behind_the_count_goes_on_with_the_next(self, site, box):
        box.tree.set(f"{INITIATOR}/count", 0)
        self.broken(site, 1)
        self.broken(site, 2)
        box.hook("ktreec_del", f"{INITIATOR}/id:1", ret=-1)
        assert status(box).status == 0
        assert [line for line in site.trace() if line.startswith("del")] == ["del id:1", "del id:2"]
