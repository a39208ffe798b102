"""What scripts/bench says of its figures: a limit that is missed is seen to be missed."""

import os
import pathlib
import sys

import pytest

TOP = pathlib.Path(__file__).resolve().parents[2]
sys.path.insert(0, str(TOP / "bench"))
os.environ.setdefault("REMVOL_BUILD", "build/release")

import page  # noqa: E402
import waits  # noqa: E402
from figures import Figure  # noqa: E402


@pytest.mark.parametrize("value, limits, text", [
    (1.2963, {"least": 1.3}, "1.296 **missed**"), (1.2604, {"least": 1.3}, "1.26 **missed**"), (1.3, {"least": 1.3}, "1.3"),
    (1.2004, {"most": 1.2}, "1.2004 **missed**"), (1.1996, {"most": 1.2}, "1.2"), (4096.2, {"most": 4096}, "4,096.2 **missed**"),
    (4097, {"most": 4096}, "4,097 **missed**"), (1234567, {}, "1,234,567"), (0, {"most": 0}, "0")])
def test_a_figure_shows_on_which_side_of_its_limit_it_is(value, limits, text):
    assert Figure("Group", "what", value, **limits).measured == text
    assert f"| what | {text} | " in page.figure_tables([Figure("Group", "what", value, **limits)])


def run_of(name, ours):
    return waits.Run(name, 1, 0, 0, 1 - ours, 0, 0, 0, ours, {})


def test_a_command_that_misses_its_goal_is_marked():
    table = waits.time_table([run_of("add", 0.0475), run_of("status", 0.03), run_of("del", 0.03002)])
    assert [row[-1] for row in table.rows] == ["4.75 % **missed**", "3 %", "3.002 % **missed**"]
    assert "the goal is at most 3 % of the command" in table.text
