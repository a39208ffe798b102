"""remvol-events: the tool is told when a session loses its connection and when it has it back."""

import fcntl
import signal
import socket
import struct
import termios

import pytest
from harness.initiator import INITIATOR, store
from harness.world import TIMEOUT

DEVICE_EVENTS, ISCSI_EVENTS = 15, 8
LOST, PDU = 102, 101
SESSIONS = "/sys/class/iscsi_session"
# When it is looked up whether a recovery that ended well is over, in milliseconds: later than one comes back that was put
# off for ten seconds.
FIRST_DOUBT = 15000


def message(kind, session, rest=b""):
    """A message as the kernel lays it out: the netlink header, struct iscsi_uevent, a PDU."""
    event = struct.pack("=IIQ24xIIQ", kind, 0, 0xFFFF0000, session, 0, 1011) + rest
    return struct.pack("=IHHII", 16 + len(event), 3, 0, 0, 0) + event


def login_response(session, flags=0x87, status=0):
    pdu = bytearray(48)
    pdu[0], pdu[1], pdu[36] = 0x23, flags, status
    return message(PDU, session, bytes(pdu))


class Events:
    """A box with sessions in its sysfs, a tree and a running listener whose netlink sockets the test writes to."""

    def __init__(self, box):
        self.box = box
        done = box.run(["/bin/mount", "-t", "tmpfs", "class", "/sys/class"], env={"LD_PRELOAD": None})
        assert done.status == 0, done.stderr
        self.daemon = None
        box.default("remvol")
        box.default("remvol-notify")

    def session(self, number, target, state="LOGGED_IN", luns=True):
        folder = self.box.path(f"{SESSIONS}/session{number}")
        (folder / "device" / (f"target{number}:0:0" if luns else "power")).mkdir(parents=True, exist_ok=True)
        self.box.write(f"{SESSIONS}/session{number}/targetname", target + "\n")
        self.state(number, state)

    def state(self, number, state):
        self.box.write(f"{SESSIONS}/session{number}/state", state + "\n")

    def remove(self, number):
        folder = self.box.path(f"{SESSIONS}/session{number}")
        folder.rename(self.box.path(f"/sys/class/gone{number}"))

    def start(self, *options, under=()):
        preload = self.box.tools / "libnetlink.so"
        self.daemon = self.box.start([*under, self.box.build / "bin" / "remvol-events", *options],
                                     env={"LD_PRELOAD": str(preload)})
        self.box.wait_until(self.place(DEVICE_EVENTS).exists, what="the listener")
        self.sync()

    def place(self, protocol):
        return self.box.path(f"/run/netlink-{protocol}")

    def send(self, data, protocol=ISCSI_EVENTS):
        self.box.wait_until(self.place(protocol).exists, what=f"the socket {protocol}")
        with socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM) as sender:
            sender.sendto(data, str(self.place(protocol)))
            self.box.wait_until(lambda: self.unread(sender) == 0, what="the message being read")

    @staticmethod
    def unread(sender):
        """The bytes sent that the receiver has not read yet."""
        return struct.unpack("i", fcntl.ioctl(sender, termios.TIOCOUTQ, bytes(4)))[0]

    def uevent(self, action="add", subsystem="iscsi_session"):
        self.send(f"{action}@/devices/x\0ACTION={action}\0SUBSYSTEM={subsystem}\0SEQNUM=1\0".encode(), DEVICE_EVENTS)

    def sync(self):
        """Returns when the listener sleeps: what was sent so far has been taken in."""

        def idle():
            stat = self.box.path(f"/proc/{self.daemon.pid}/stat").read_text()
            return stat.rsplit(")", 1)[1].split()[0] == "S"

        self.box.wait_until(idle, what="the listener being idle")

    def patience(self):
        """How long the listener waits for an event, in milliseconds: the time limit of its poll(2), -1 for none. Nothing
        while it does not wait."""
        call = self.box.path(f"/proc/{self.daemon.pid}/syscall").read_text().split()
        return struct.unpack("i", struct.pack("Q", int(call[3], 16))[:4])[0] if len(call) > 3 else None

    def asleep_for_good(self):
        """True when only an event can wake the listener."""
        return self.patience() == -1

    def wait_runs(self, *expected):
        """Waits until the tool has been run that often, and compares."""
        self.box.wait_until(lambda: len(self.runs) >= len(expected), what=f"{expected}, ran {self.runs}")
        assert self.runs == list(expected)

    def waits_longer(self):
        return (self.patience() or 0) > FIRST_DOUBT

    def wait_for_doubt(self, condition, what):
        self.box.wait_until(condition, TIMEOUT + FIRST_DOUBT / 1000, what)

    @property
    def runs(self):
        return [tuple(call) for call in self.box.runs("remvol")]

    def stop(self):
        self.daemon.kill(signal.SIGTERM)
        return self.daemon.wait()


def reopen(target):
    return ("--oiscsi_evt_reopen", "-n", target)


def recover(target):
    return ("--oiscsi_evt_recover", "-n", target)


@pytest.fixture
def events(box):
    events = Events(box)
    yield events
    if events.daemon is not None and events.daemon.result is None:
        assert events.stop().status == 0


@pytest.fixture
def connected(events):
    """A listener with one connected target, whose first look is over."""
    events.session(1, "iqn.a")
    events.start()
    events.wait_runs(recover("iqn.a"))
    events.box.wait_until(lambda: events.box.runs("remvol-notify"), what="news of the first look")
    events.box.forget()
    return events


def test_a_loss_and_a_return_are_told(connected):
    connected.state(1, "FAILED")
    connected.send(message(LOST, 1))
    connected.wait_runs(reopen("iqn.a"))
    connected.send(login_response(1))
    connected.state(1, "LOGGED_IN")
    connected.wait_runs(reopen("iqn.a"), recover("iqn.a"))


def test_a_starter_that_ignores_the_end_of_its_children_makes_no_difference(events):
    events.session(1, "iqn.a")
    events.start(under=("env", "--ignore-signal=CHLD"))
    events.wait_runs(recover("iqn.a"))
    events.box.wait_until(lambda: events.box.runs("remvol-notify"), what="news of the end of the recovery")


def test_the_return_is_told_when_the_session_is_usable_again(connected):
    connected.state(1, "FAILED")
    connected.send(message(LOST, 1))
    connected.wait_runs(reopen("iqn.a"))
    connected.send(login_response(1))
    connected.sync()
    assert connected.runs == [reopen("iqn.a")]
    connected.state(1, "LOGGED_IN")
    connected.wait_runs(reopen("iqn.a"), recover("iqn.a"))


def test_a_state_that_follows_the_event_late_is_waited_for(connected):
    connected.send(message(LOST, 1))
    connected.sync()
    assert connected.runs == []
    connected.state(1, "FAILED")
    connected.wait_runs(reopen("iqn.a"))


def test_a_loss_that_is_over_before_it_was_seen_is_told(connected):
    connected.send(message(LOST, 1))
    connected.send(login_response(1))
    connected.wait_runs(reopen("iqn.a"), recover("iqn.a"))


def test_a_session_given_up_by_the_kernel_is_still_lost(connected):
    connected.state(1, "FREE")
    connected.send(message(LOST, 1))
    connected.wait_runs(reopen("iqn.a"))
    connected.state(1, "LOGGED_IN")
    connected.wait_runs(reopen("iqn.a"), recover("iqn.a"))


def test_the_error_that_ends_a_logout_is_no_loss(connected):
    connected.session(2, "iqn.b")
    connected.uevent()
    connected.send(message(LOST, 1))
    connected.remove(1)
    connected.uevent("remove")
    connected.state(2, "FAILED")
    connected.send(message(LOST, 2))
    connected.wait_runs(reopen("iqn.b"))


def test_a_first_login_is_neither_loss_nor_return(events):
    events.start()
    events.session(1, "iqn.a", state="FREE", luns=False)
    events.uevent()
    events.send(message(LOST, 1))
    events.send(login_response(1))
    events.session(1, "iqn.a")
    events.uevent()
    events.state(1, "FAILED")
    events.send(message(LOST, 1))
    events.wait_runs(reopen("iqn.a"))


def test_a_session_that_is_named_after_it_was_told_of_is_followed(events):
    events.start()
    events.session(1, "", state="FREE", luns=False)
    events.uevent()
    events.sync()
    events.session(1, "iqn.a")
    events.state(1, "FAILED")
    events.send(message(LOST, 1))
    events.wait_runs(reopen("iqn.a"))


@pytest.mark.parametrize("answer", [
    login_response(1, status=2),
    login_response(1, flags=0x81),
    login_response(1, flags=0x04),
    message(PDU, 1, b"\x26" + bytes(47)),
    message(PDU, 1, b"\x23" + bytes(20)),
], ids=["refused", "a step on the way", "no step", "a logout response", "cut short"])
def test_only_an_accepted_login_proves_a_return(connected, answer):
    connected.send(message(LOST, 1))
    connected.send(answer)
    connected.sync()
    assert connected.runs == []


@pytest.mark.parametrize("noise", [
    b"", b"\0", bytes(16), message(LOST, 1)[:30], message(LOST, 9), message(104, 1), message(LOST, 1)[:60],
    b"\xff" * 4096, struct.pack("=IHHII", 4, 3, 0, 0, 0), b"foreign " + message(LOST, 1),
], ids=["empty", "a byte", "an empty header", "cut in the event", "another session", "another type", "cut at the end",
        "garbage", "a length too small", "another sender"])
def test_noise_does_nothing(connected, noise):
    connected.state(1, "LOGGED_IN")
    connected.send(noise)
    connected.send(login_response(1))
    connected.state(1, "FAILED")
    connected.send(message(LOST, 1))
    connected.wait_runs(reopen("iqn.a"))


def test_one_event_at_a_time_a_target(connected):
    connected.box.fake("remvol", "--oiscsi_evt_reopen", effect="until [ -e /go ]; do sleep 0.01; done", times=1)
    connected.state(1, "FAILED")
    connected.send(message(LOST, 1))
    connected.wait_runs(reopen("iqn.a"))
    for _ in range(3):
        connected.send(login_response(1))
        connected.state(1, "LOGGED_IN")
        connected.send(message(0, 1))
        connected.sync()
    assert connected.runs == [reopen("iqn.a")]
    connected.box.write("/go", "")
    connected.wait_runs(reopen("iqn.a"), recover("iqn.a"))


def test_targets_do_not_wait_for_each_other(events):
    events.session(1, "iqn.a", state="FAILED")
    events.box.fake("remvol", "--oiscsi_evt_reopen -n iqn.a", effect="until [ -e /go ]; do sleep 0.01; done", times=1)
    events.session(2, "iqn.b", state="FAILED")
    events.start()
    events.box.wait_until(lambda: len(events.runs) == 2, what="both targets")
    assert sorted(events.runs) == [reopen("iqn.a"), reopen("iqn.b")]
    events.state(2, "LOGGED_IN")
    events.box.wait_until(lambda: recover("iqn.b") in events.runs, what="the return of one")
    events.box.write("/go", "")


def test_a_recovery_that_the_next_loss_overtakes_is_left_out(connected):
    connected.box.fake("remvol", "--oiscsi_evt_reopen", effect="until [ -e /go ]; do sleep 0.01; done", times=1)
    connected.state(1, "FAILED")
    connected.send(message(LOST, 1))
    connected.wait_runs(reopen("iqn.a"))
    for state, event in 2 * [("LOGGED_IN", login_response(1)), ("FAILED", message(LOST, 1))]:
        connected.state(1, state)
        connected.send(event)
        connected.sync()
    connected.box.write("/go", "")
    connected.wait_runs(reopen("iqn.a"), reopen("iqn.a"))
    connected.state(1, "LOGGED_IN")
    connected.wait_runs(reopen("iqn.a"), reopen("iqn.a"), recover("iqn.a"))


@pytest.mark.native
def test_a_recovery_that_failed_is_tried_again(connected):
    connected.box.fake("remvol", "--oiscsi_evt_recover", status=255, times=2)
    connected.state(1, "FAILED")
    connected.send(message(LOST, 1))
    connected.wait_runs(reopen("iqn.a"))
    connected.state(1, "LOGGED_IN")
    connected.send(login_response(1))
    connected.wait_runs(reopen("iqn.a"), recover("iqn.a"), recover("iqn.a"), recover("iqn.a"))
    connected.box.wait_until(lambda: connected.asleep_for_good(), what="the end of the retries")


@pytest.mark.native
def test_a_recovery_that_was_killed_behind_the_logout_is_tried_again(connected):
    gone = f"mv {SESSIONS}/session1 /sys/class/gone1; exit 255"
    connected.box.fake("remvol", "--oiscsi_evt_recover", status=255, effect=gone, times=1)
    connected.state(1, "FAILED")
    connected.send(message(LOST, 1))
    connected.wait_runs(reopen("iqn.a"))
    connected.state(1, "LOGGED_IN")
    connected.send(login_response(1))
    connected.wait_runs(reopen("iqn.a"), recover("iqn.a"), recover("iqn.a"))
    connected.box.wait_until(lambda: connected.asleep_for_good(), what="the end of the retries")


@pytest.mark.native
def test_a_reopen_that_failed_is_not_tried_again(connected):
    connected.box.fake("remvol", "--oiscsi_evt_reopen", status=255)
    connected.state(1, "FAILED")
    connected.send(message(LOST, 1))
    connected.wait_runs(reopen("iqn.a"))
    connected.state(1, "LOGGED_IN")
    connected.send(login_response(1))
    connected.wait_runs(reopen("iqn.a"), recover("iqn.a"))
    connected.box.wait_until(lambda: connected.asleep_for_good(), what="no retry")


@pytest.mark.native
def test_people_are_told_after_each_order(connected):
    connected.state(1, "FAILED")
    connected.send(message(LOST, 1))
    connected.wait_runs(reopen("iqn.a"))
    told = lambda: connected.box.runs("remvol-notify")
    connected.box.wait_until(lambda: told() == [[]], what="news of the loss")
    connected.state(1, "LOGGED_IN")
    connected.send(login_response(1))
    connected.wait_runs(reopen("iqn.a"), recover("iqn.a"))
    connected.box.wait_until(lambda: told() == [[], []], what="news of the return")
    connected.box.wait_until(lambda: connected.asleep_for_good(), what="the end")


def test_another_program_may_tell_people(events):
    events.box.default("teller")
    events.session(1, "iqn.a")
    events.start("--notifier", "teller")
    events.box.wait_until(lambda: events.box.runs("teller") == [[]], what="news of the first look")
    assert events.box.runs("remvol-notify") == []


@pytest.mark.native
def test_a_recovery_that_is_given_up_is_told(connected):
    connected.box.fake("remvol", "--oiscsi_evt_recover", status=255)
    connected.state(1, "FAILED")
    connected.send(message(LOST, 1))
    connected.wait_runs(reopen("iqn.a"))
    connected.state(1, "LOGGED_IN")
    connected.send(login_response(1))
    connected.wait_runs(reopen("iqn.a"), *[recover("iqn.a")] * 4)
    given_up = ["--recovery-failed", "iqn.a"]
    connected.box.wait_until(lambda: given_up in connected.box.runs("remvol-notify"), what="news")
    connected.box.wait_until(lambda: connected.asleep_for_good(), what="the end of the retries")
    assert connected.box.runs("remvol-notify").count(given_up) == 1


def test_the_sessions_of_others_are_nobodys_business_here(events):
    """From the first look to the return, and without a word in the log."""
    store(events.box, "iqn.a")
    events.box.tree.set({f"{INITIATOR}/ver": 1})
    for number, name in enumerate(["iqn.a1", "iqn.a", "iqn.A"], 1):
        events.session(number, name)
    events.start()
    events.wait_runs(recover("iqn.a"))
    for state, event in (("FAILED", message(LOST, 1)), ("LOGGED_IN", login_response(1))):
        for number in (1, 3, 2):
            events.state(number, state)
        events.send(event)
    events.wait_runs(recover("iqn.a"), reopen("iqn.a"), recover("iqn.a"))
    events.box.wait_until(lambda: len(events.box.runs("remvol-notify")) == 3, what="news of each order")
    assert "iqn.a1" not in events.daemon.stderr and "iqn.A" not in events.daemon.stderr


def test_a_target_that_is_added_while_its_session_is_there_is_told_of(events):
    events.box.tree.set({f"{INITIATOR}/ver": 1})
    events.session(1, "iqn.a")
    events.start()
    events.box.wait_until(events.asleep_for_good, what="the end of the first look")
    store(events.box, "iqn.a")
    events.state(1, "FAILED")
    events.send(message(LOST, 1))
    events.wait_runs(reopen("iqn.a"))


def test_a_tree_without_its_settings_does_not_say_whose_a_session_is(events):
    store(events.box, "iqn.b")
    events.session(1, "iqn.a", state="FAILED")
    events.start()
    events.wait_runs(reopen("iqn.a"))


LOST_TARGETS = ["iqn.a", "iqn.b", "iqn.c", "iqn.d"]


def store_lost_targets(box):
    for number, name in enumerate(LOST_TARGETS, 1):
        store(box, name, slot=number, conn_set=1, conn_state=3)


@pytest.fixture
def doubtful(events):
    """A listener with targets that are lost, whatever recoveries do."""
    store_lost_targets(events.box)
    for number, name in enumerate(LOST_TARGETS, 1):
        events.session(number, name)
    events.start()
    events.box.wait_until(lambda: len(events.box.runs("remvol-notify")) == 4, what="the recoveries' ends")
    events.box.wait_until(lambda: 10000 < (events.patience() or 0) <= FIRST_DOUBT, what="the doubt")
    events.box.forget()
    return events


@pytest.mark.native
def test_a_recovery_that_nobody_finished_is_ordered_again(doubtful):
    """Also one that is queued without a run that is at the queue, and where the tree was started anew meanwhile."""
    doubtful.box.tree.restart()
    store_lost_targets(doubtful.box)
    doubtful.box.tree.set({"/temp/remvol/recover/queue/id:1/target_name": "iqn.a"})
    doubtful.wait_for_doubt(lambda: len(doubtful.runs) >= 4, "the next recoveries")
    doubtful.box.wait_until(doubtful.waits_longer, what="a longer wait for the next ones")
    assert sorted(doubtful.runs) == [recover(name) for name in LOST_TARGETS]
    assert doubtful.daemon.stderr.count("its recovery was not finished, it is tried again") == 4


HOLD = """
import fcntl, os, time
os.makedirs("/var/lock/virtual_volume", exist_ok=True)
lock = open("/var/lock/virtual_volume/remvol_recover.lock", "w")
fcntl.lockf(lock, fcntl.LOCK_EX)
open("/held", "w")
time.sleep(1000)
"""


@pytest.mark.native
def test_a_recovery_that_a_run_is_at_is_waited_for(doubtful):
    """What a run has taken from the queue is named nowhere; the run has the lock."""
    box = doubtful.box
    box.start(["/usr/bin/python3", "-c", HOLD], env={"LD_PRELOAD": None})
    box.wait_until(lambda: box.path("/held").exists(), what="the lock")
    at_work = [("-w", "10", *recover("iqn.a")), recover("iqn.d")]
    for words in at_work:
        box.fake("remvol", " ".join(words), exact=True, effect="until [ -e /go ]; do sleep 0.01; done")
        box.start(["remvol", *words])
    box.wait_until(lambda: len(doubtful.runs) == 2, what="the runs")
    doubtful.wait_for_doubt(doubtful.waits_longer, "the next look")
    assert sorted(doubtful.runs) == sorted(at_work)
    box.write("/go", "")


@pytest.mark.native
def test_a_recovery_that_is_over_is_forgotten(doubtful):
    """Recovered, taken out, not wanted any more, deleted."""
    values = {"id:1/conn_state": 1, "id:2/conn_state": 0, "id:3/conn_set": 0, "id:4/target": "iqn.e"}
    doubtful.box.tree.set({f"{INITIATOR}/{key}": value for key, value in values.items()})
    doubtful.wait_for_doubt(doubtful.asleep_for_good, "the end of the doubt")
    assert doubtful.runs == []


@pytest.mark.native
def test_a_tree_that_is_away_is_asked_later(doubtful):
    doubtful.box.tree.stop()
    doubtful.wait_for_doubt(doubtful.waits_longer, "the next look")
    assert doubtful.runs == []


@pytest.mark.native
def test_a_recovery_that_did_its_work_is_never_in_doubt(events):
    store(events.box, "iqn.a", conn_set=1, conn_state=1)
    events.session(1, "iqn.a")
    events.start()
    events.wait_runs(recover("iqn.a"))
    events.box.wait_until(lambda: events.box.runs("remvol-notify"), what="the end of the recovery")
    events.box.wait_until(events.asleep_for_good, what="no doubt")


def test_a_test_of_what_is_told(bare_box):
    bare_box.fake("remvol-notify", "--test", status=1)
    assert bare_box.run([bare_box.build / "bin" / "remvol-events", "--test"], env={"LD_PRELOAD": None}).status == 1


def test_a_burst_of_eight_targets_loses_nothing(events):
    names = [f"iqn.{number}" for number in range(1, 9)]
    for number, name in enumerate(names, 1):
        events.session(number, name)
    events.start()
    events.box.wait_until(lambda: len(events.runs) == 8, what="the first look")
    events.box.forget()
    for number in range(1, 9):
        events.state(number, "FAILED")
    for _ in range(50):
        for number in range(1, 9):
            events.send(message(LOST, number))
    events.box.wait_until(lambda: len(events.runs) >= 8, what="all losses")
    for number in range(1, 9):
        events.state(number, "LOGGED_IN")
        events.send(login_response(number))
    events.box.wait_until(lambda: len(events.runs) >= 16, what="all returns")
    assert sorted(events.runs) == sorted([reopen(n) for n in names] + [recover(n) for n in names])
    for name in names:
        own = [run for run in events.runs if run[2] == name]
        assert own == [reopen(name), recover(name)]


def test_lost_events_are_made_up_for_by_a_look_at_all_sessions(connected):
    connected.session(2, "iqn.b")
    connected.uevent()
    connected.state(1, "FAILED")
    connected.send(b"overrun")
    connected.box.wait_until(lambda: len(connected.runs) >= 2, what="the look")
    assert sorted(connected.runs) == [recover("iqn.b"), reopen("iqn.a")]


def test_a_restart_finds_what_happened_meanwhile(events):
    events.session(1, "iqn.up")
    events.session(2, "iqn.down", state="FAILED")
    events.session(3, "iqn.new", state="FREE", luns=False)
    events.start()
    events.box.wait_until(lambda: len(events.runs) >= 2, what="the first look")
    assert sorted(events.runs) == [recover("iqn.up"), reopen("iqn.down")]
    events.state(2, "LOGGED_IN")
    events.box.wait_until(lambda: recover("iqn.down") in events.runs, what="the return")


def test_the_module_can_be_unloaded_after_the_last_session(events):
    events.start()
    assert not events.place(ISCSI_EVENTS).exists()
    events.session(1, "iqn.a")
    events.uevent()
    events.box.wait_until(events.place(ISCSI_EVENTS).exists, what="the socket")
    descriptors = events.box.path(f"/proc/{events.daemon.pid}/fd")
    before = len(list(descriptors.iterdir()))
    events.remove(1)
    events.uevent("remove")
    events.box.wait_until(lambda: len(list(descriptors.iterdir())) == before - 1, what="the socket being closed")


def test_other_devices_are_not_looked_at(events):
    events.start()
    events.session(1, "iqn.a")
    events.uevent(subsystem="block")
    events.sync()
    assert not events.place(ISCSI_EVENTS).exists()


def test_without_connection_events_the_sessions_are_watched(events):
    events.box.write(f"/run/netlink-{ISCSI_EVENTS}-refused", "")
    events.session(1, "iqn.a")
    events.start()
    events.wait_runs(recover("iqn.a"))
    events.state(1, "FAILED")
    events.wait_runs(recover("iqn.a"), reopen("iqn.a"))
    events.state(1, "LOGGED_IN")
    events.wait_runs(recover("iqn.a"), reopen("iqn.a"), recover("iqn.a"))
    assert events.daemon.stderr.count("no connection events") == 1


def test_a_target_name_is_one_argument_whatever_it_holds(events):
    name = "iqn.x $(touch /bad) 'q' \"p\" -n"
    events.session(1, name, state="FAILED")
    events.start()
    events.wait_runs(reopen(name))
    assert not events.box.path("/bad").exists()


@pytest.mark.native
def test_a_tool_that_cannot_be_started_ends_nothing(events):
    events.session(1, "iqn.a", state="FAILED")
    events.box.environment["PATH"] = "/nowhere"
    events.start()
    events.box.wait_until(lambda: "No such file" in events.daemon.stderr, what="the complaint")
    assert events.daemon.result is None


def test_it_ends_without_taking_the_tool_along(connected):
    connected.box.fake("remvol", "--oiscsi_evt_reopen", effect="until [ -e /go ]; do sleep 0.01; done; touch /done",
                       times=1)
    connected.state(1, "FAILED")
    connected.send(message(LOST, 1))
    connected.wait_runs(reopen("iqn.a"))
    assert connected.stop().status == 0
    connected.box.write("/go", "")
    connected.box.wait_until(connected.box.path("/done").exists, what="the tool going on")


def test_a_broken_socket_ends_it_so_that_it_is_started_again(connected):
    connected.send(b"broken")
    assert connected.daemon.wait().status != 0


def test_help_version_and_usage(bare_box):
    program = bare_box.build / "bin" / "remvol-events"
    for option in ("-h", "--help"):
        done = bare_box.run([program, option])
        assert done.status == 0 and done.stdout.startswith("usage: remvol-events") and done.stderr == ""
    assert bare_box.run([program, "--version"]).stdout.startswith("remvol-events ")
    for words in (["--what"], ["--test", "x"], ["--notifier"], ["--notifier", "x", "x"], ["--help", "x"], [""]):
        done = bare_box.run([program, *words])
        assert (done.status, done.stdout) == (2, "") and done.stderr.startswith("usage: ")


@pytest.mark.parametrize("program", ["remvol-events", "remvol-keeper", "remvol-notify"])
@pytest.mark.parametrize("option", ["--help", "--version"])
def test_a_help_that_cannot_be_written_is_a_failure(bare_box, program, option):
    done = bare_box.run(["sh", "-c", '"$@" >/dev/full', "sh", program, option])
    assert (done.status, done.stderr) == (1, f"{program}: write error: No space left on device\n")
