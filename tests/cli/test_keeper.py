"""remvol-keeper: what should be connected and is not is tried again; the initiator's daemon is there."""

import signal

import pytest
from harness.initiator import store

SESSIONS = "/sys/class/iscsi_session"


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
        env = {"LD_PRELOAD": str(self.box.tools / "libnetlink.so")}
        self.daemon = self.box.start([*under, self.box.build / "bin/remvol-keeper"], env=env)

    def wait_runs(self, *expected):
        self.box.wait_until(lambda: len(self.runs) >= len(expected), what=f"{expected}, ran {self.runs}")
        assert self.runs[:len(expected)] == list(expected)

    @property
    def runs(self):
        return [tuple(call) for call in self.box.runs("remvol")]


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


@pytest.mark.parametrize("named", ["-n iqn.t2", "-n iqn.t1", ""], ids=["another", "itself", "all"])
def test_only_a_command_for_the_target_keeps_it_away(keeper, named):
    box = keeper.box
    box.write("/tmp/bin/remvol", "#!/bin/sh\nsleep 1000\n").chmod(0o755)
    box.start(["/tmp/bin/remvol", "--disconnect", *named.split()], env={"LD_PRELOAD": None})
    keeper.target(1, port=3260)
    listen(box)
    keeper.start()
    if "t2" in named:
        keeper.wait_runs(("--status",), ("--connect", "-n", "iqn.t1"))
    else:
        box.run(["/bin/sleep", "6"], env={"LD_PRELOAD": None})
        assert keeper.runs == []


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


def test_the_initiator_is_started_when_it_is_gone(keeper):
    keeper.start()
    keeper.box.wait_until(lambda: keeper.box.runs("iscsid"), what="iscsid being started")
    assert list(keeper.box.runs("iscsid")[0]) == ["-f"]


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
