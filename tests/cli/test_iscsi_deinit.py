"""`--deinit` and `--system_off`: the initiator taken down."""

import signal

import pytest
from harness import messages
from harness.initiator import SHARES, T1, Initiator, store

MODULES = ["iscsi_tcp.ko", "libiscsi_tcp.ko", "libiscsi.ko", "scsi_transport_iscsi.ko"]
LOGOUT_ALL = "system iscsiadm -m node -u"
STOP_ISCSID = "system killall -SIGTERM iscsid"
STOP_TREE = "system kill -SIGTERM `cat /var/run/ktree_sock_vv_config.pid`"
PID_FILE = "/var/run/ktree_sock_vv_config.pid"
ROAD = {
    "--deinit": [
        LOGOUT_ALL,
        STOP_ISCSID,
        f"system {SHARES}",
        *(f"system rmmod {module}" for module in MODULES),
        STOP_TREE,
    ],
    "--system_off": [LOGOUT_ALL, STOP_ISCSID, STOP_TREE],
}


@pytest.fixture
def initiator(box):
    """With a session: without one the logout of all fails."""
    box.default("killall")
    box.default("rmmod")
    initiator = Initiator(box)
    initiator.offer(T1, {1: "sdb"})
    initiator.log_in(T1)
    return initiator


def take_down(box, command, *args):
    done = box.remvol(*args, command)
    box.wait_until(lambda: not tree_runs(box), what="the end of the tree's daemon")
    return done


def tree_runs(box):
    return any(argv[0].endswith("ktree") for argv in box.processes().values())


@pytest.mark.parametrize("command", ROAD)
def test_the_steps_in_their_order(box, initiator, command):
    done = take_down(box, command)
    assert done.status == 0
    assert [call for call in box.trace() if "flashrun" not in call] == ROAD[command]


@pytest.mark.parametrize("command", ROAD)
def test_every_volume_is_taken_away_before_the_logout(box, initiator, command):
    store(box, T1, conn_set=1, luns=[("share1", 1, {"mnt": "/mnt/VV/share1", "mnt_dev": "/dev/sdb1"})])
    box.path("/mnt/VV/share1").mkdir(parents=True)
    box.default("fuser")
    assert take_down(box, command).status == 0
    calls = box.trace()
    assert calls[: calls.index(LOGOUT_ALL)][-1] == 'system rm -rf "/mnt/VV/share1"'
    assert not box.path("/mnt/VV/share1").exists()


@pytest.mark.parametrize("command", ROAD)
def test_all_sessions_are_closed(box, initiator, command):
    assert take_down(box, command).status == 0
    assert initiator.sessions() == []


@pytest.mark.parametrize("command", ROAD)
def test_without_a_session_the_logout_fails_and_nothing_else(box, initiator, command):
    box.fake("iscsiadm", "-m node -u", status=21)
    done = take_down(box, command)
    assert done.status == 0
    assert "system() of cmd 'iscsiadm -m node -u' failed" in done.stdout


# The last command of the teardown alone decides.
@pytest.mark.parametrize(
    "command, failing, status",
    [
        ("--system_off", "killall -SIGTERM iscsid", 255),
        ("--deinit", "killall -SIGTERM iscsid", 0),
        ("--deinit", "rmmod scsi_transport_iscsi.ko", 255),
        ("--deinit", "rmmod iscsi_tcp.ko", 0),
        ("--deinit", "rmmod libiscsi.ko", 0),
    ],
)
def test_the_status_is_that_of_the_last_command(box, initiator, command, failing, status):
    box.fake(*failing.split(" ", 1), status=1)
    done = take_down(box, command)
    assert done.status == status
    assert f"system() of cmd '{failing}' failed" in done.stdout
    assert [call for call in box.trace() if call != "system winshare_reload"] == ROAD[command]


def test_a_caller_that_ignores_the_end_of_its_children_gets_the_status(box, initiator):
    done = box.run(["env", "--ignore-signal=CHLD", "remvol", "--deinit"])
    assert done.status == 0 and "failed" not in done.stdout


def test_the_log_tells_the_steps(box, initiator):
    box.tree.set("/iscsi/initiator/dbg", "2")
    done = take_down(box, "--deinit")
    steps = ["deinit start", "killall -SIGTERM iscsid ", "deinit end", "update share folder status",
             "finish share folder status"]
    assert messages(done, "task_deinit") == steps


def test_the_log_of_a_system_off(box, initiator):
    box.tree.set("/iscsi/initiator/dbg", "2")
    done = take_down(box, "--system_off")
    steps = ["system off", "killall -SIGTERM iscsid ", "deinit end"]
    assert messages(done, "task_deinit") == steps


@pytest.mark.parametrize("shell", ["dash", "bash"])
def test_the_trees_daemon_is_stopped_whatever_the_shell(box, initiator, shell):
    box.run(["ln", "-sf", shell, "/usr/bin/sh"])
    take_down(box, "--system_off")
    assert not box.path(PID_FILE).exists()


def test_another_process_in_the_pid_file_is_left_alone(box, initiator):
    other = box.start(["sleep", "60"])
    box.path(PID_FILE).write_text(f"{other.pid}\n")
    assert box.remvol("--system_off").status == 0
    assert tree_runs(box)
    other.kill(signal.SIGVTALRM)  # comes after a SIGTERM that is still on its way
    assert other.wait().status == -signal.SIGVTALRM


@pytest.mark.parametrize("text", ["", "none\n", "0\n", "-1\n", "1\n", "99999999\n"])
def test_a_pid_file_without_a_process_harms_nobody(box, initiator, text):
    box.path(PID_FILE).write_text(text)
    assert box.remvol("--system_off").status == 0
    assert tree_runs(box)


def test_a_number_that_no_process_has_is_not_cut_to_one(box, initiator):
    pid = int(box.path(PID_FILE).read_text())
    box.path(PID_FILE).write_text(f"{(1 << 32) + pid}\n")
    assert box.remvol("--system_off").status == 0
    assert tree_runs(box)


def test_the_settings_are_saved_no_more(box, initiator):
    box.write("/etc/NAS_CFG/vv.xml", "saved before\n")
    take_down(box, "--deinit")
    assert box.path("/etc/NAS_CFG/vv.xml").read_text() == "saved before\n"


@pytest.mark.parametrize("command", ROAD)
def test_nothing_is_told_of_a_dump_behind_the_trees_end(box, initiator, command):
    box.write("/etc/NAS_CFG/vv.xml", "<config><iscsi><initiator><ver>1</ver></initiator></iscsi></config>\n")
    assert "never loaded" not in take_down(box, command).stdout
    assert "<ver>1</ver>" in box.path("/etc/NAS_CFG/vv.xml").read_text()
