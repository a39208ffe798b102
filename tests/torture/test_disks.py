"""The judge of the rounds on real disks sees what it is there to see."""

import pytest

import disks
from disks import BLANK, DISKS, Report, Round, Run
from world import arguments


def as_before(seed=7):
    """What is on the disks when a round begins."""
    found = {disk: (8, "0", "-", "") if disk in BLANK else (0, "table", "text", f"{disk[0]} {disk[1]} {seed}") for disk in DISKS}
    return found | {(t, 3): "somebody else's" for t in disks.TARGETS}


class Rounded(Round):
    """A round whose runs and disks are given."""

    def __init__(self, found, formatted=(), runs=(), well=()):
        super().__init__(type("Life", (), {"appliance": None}), 7, 0)
        self.world = type("Machine", (), {"formatted": set(formatted), "jobs": []})
        for command, t, l in runs:
            self.world.jobs.append(Run(len(self.world.jobs) + 1, command, t, l, None, arguments(command, t, l)))
        self.before, self.well, self.found = as_before(), set(well), found

    def disks(self):
        return self.found

    def kinds(self):
        self.look_at_disks()
        return sorted(text.split(":")[0] for text in self.findings)


def test_disks_that_are_as_before_are_well():
    assert Rounded(as_before()).kinds() == []


@pytest.mark.parametrize("change", [(4, "table", "text", "1 1 7"), (0, "other", "text", "1 1 7"), (0, "table", "", "1 1 7"),
                                    (0, "table", "text", ""), (0, "table", "text", "2 1 7")])
def test_data_that_nobody_asked_to_format_is_missed(change):
    assert Rounded(as_before() | {(1, 1): change}, runs=[("del", 1, None)]).kinds() == ["data-lost"]
    assert Rounded(as_before() | {(1, 1): change}, formatted=[(1, 1)]).kinds() == []


def test_somebody_elses_disk_is_missed():
    assert Rounded(as_before() | {(3, 3): "x"}, runs=[("format", 3, None)], formatted=[(3, 3)]).kinds() == ["foreign-disk"]


def test_a_blank_disk_is_written_only_for_a_run_that_names_it():
    found = as_before() | {(5, 2): (0, "table", "-", "")}
    assert Rounded(found).kinds() == ["foreign-disk"]
    assert Rounded(found, runs=[("add", 5, 1)]).kinds() == ["foreign-disk"]
    assert Rounded(found, runs=[("connect", 5, None)]).kinds() == []


def test_a_volume_that_is_damaged_is_missed_while_it_is_stored():
    found = as_before() | {(5, 2): (4, "table", "-", ""), (1, 1): (4, "table", "-", "")}
    runs = [("add", 5, 2)]
    assert Rounded(found, [(1, 1)], runs).kinds() == []
    assert Rounded(found, [(1, 1)], runs, well=[(1, 1), (5, 2)]).kinds() == ["damaged", "damaged"]


@pytest.mark.parametrize("command, other, t, began, crashed", [
    ("format", "disconnect", 2, 1, False),
    ("format", "disconnect", None, 1, False),
    ("format", "disconnect", 3, 1, True),
    ("format", "disconnect", 2, 6, True),
    ("format", "status", None, 1, True),
    ("status", "disconnect", 2, 1, True)])
def test_a_run_may_be_ended_as_a_user_of_the_disk_that_is_taken_away(command, other, t, began, crashed):
    machine = disks.Machine(None, 7)
    run, taker = machine.job(command, 2), machine.job(other, t)
    run.began, run.ended, run.ending = 0, 5, -9
    taker.began, taker.ended, taker.ending = began, 10, 0
    assert machine.findings() == ([f"crash: {run}"] if crashed else [])
    run.ending = -11
    assert machine.findings() == [f"crash: {run}"]


REPORT = """/iscsi/initiator/count=1
session 1
lun sdb 1 1
mount /mnt/VV/v11 /dev/sdb1 1 1 {}
folder v11
semaphore 1
"""


@pytest.mark.parametrize("mark, doubtful, seen", [
    ("1 1 7", (), (1, 1, 7)), ("2 1 7", (), None), ("1 1 6", (), (1, 1, 6)), ("", (), None), ("", [(1, 1)], (1, 1, 7))])
def test_whose_data_a_mount_shows(mark, doubtful, seen):
    report = Report(REPORT.format(mark), 7, set(doubtful))
    assert report.mounts == {"/mnt/VV/v11": ["/dev/sdb1"]} and report.folders == ["v11"] and report.semaphore == "1"
    assert report.state()[1][3][1].dev == "sdb" and report.state()[1][0] and not report.state()[2][0]
    assert report.mark("/mnt/VV/v11") == seen


def test_the_plan_is_the_seeds():
    assert disks.plan(5, 64) == disks.plan(5, 64) != disks.plan(6, 64)
    assert sum(kind == "run" for _, kind, _ in disks.plan(5, 64)) == 64
    assert sum(kind == "restart" for _, kind, _ in disks.plan(5, 64)) == 2
