"""What scripts/bench computes of a larger appliance: from known slopes the known cost, and limits that the sources have."""

import os
import pathlib
import sys

import pytest

TOP = pathlib.Path(__file__).resolve().parents[2]
sys.path.insert(0, str(TOP / "bench"))
os.environ.setdefault("REMVOL_BUILD", "build/release")

import appliance_tree  # noqa: E402
import scale  # noqa: E402


SMALL = [scale.Size(*size) for size in scale.SMALL]
LARGEST = scale.raised(64, 16)


def test_what_grows_with_targets_and_luns():
    small = [(size, {"vvstat": 100 + 7 * size.targets + 3 * size.luns}) for size in SMALL]
    assert scale.computed("vvstat", small, LARGEST, 0) == pytest.approx(100 + 7 * 64 + 3 * 1024)


def test_what_grows_with_each_listing():
    def cost(size):
        return 100 + 20 * size.targets + 30 * size.luns + 0.5 * size.targets * (4 * size.targets + 2 * size.luns)

    name = "remvol --status, milliseconds"
    small = [(size, {name: cost(size)}) for size in SMALL]
    assert scale.computed(name, small, LARGEST, 0.5) == pytest.approx(cost(LARGEST))


def test_what_free_slots_cost():
    name = "remvol --status, requests to the tree"
    small = [(size, {name: 5 + 4 * size.luns + size.free_targets + 3 * size.open_targets}) for size in SMALL]
    assert scale.computed(name, small, scale.raised(32, 16), 0) == pytest.approx(5 + 4 * 512 + 32)
    assert scale.computed(name, small, scale.raised(64, 8), 0) == pytest.approx(5 + 4 * 512 + 3 * 64)


@pytest.mark.parametrize("text, number", [
    ("constexpr int kMost = 100;  // of all", 100), ("constexpr size_t kMost = size_t{32} << 20;", 32 << 20),
    ("#ifndef kMost\n#define kMost 8\n", 8), ("constexpr long kMost = 1'000;", 1000)])
def test_a_number_of_a_source(tmp_path, text, number):
    (tmp_path / "source.h").write_text(text)
    assert scale.constant(tmp_path / "source.h", "kMost") == number


def test_names_of_disks():
    assert [appliance_tree.disk_of(*each) for each in ((1, 1), (2, 10), (2, 11), (44, 14), (44, 15), (64, 16))] == [
        "sda", "sdz", "sdaa", "sdzz", "sdaaa", "sdamj"]


def test_the_limits_are_found_in_the_sources():
    nodes, size_of_file = scale.TREE[:2]
    table = scale.limits_table([(size, {nodes: 9 * size.targets + 19 * size.luns, size_of_file: 1}) for size in SMALL])
    limits = {row[0]: row[2:4] for row in table.rows}
    assert limits["targets"] == ["8", "64"]
    assert limits["LUNs in all"] == ["8", "1,024"]
    assert limits["nodes of the tree"] == ["262,144", f"{9 * 64 + 19 * 1024:,}"]
    assert limits["characters of a disk's name"] == ["7", "5"]
    assert limits["of a recovery of all"][1] == "6,144"
