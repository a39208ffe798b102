"""`--modify_address`: a stored target moves to another portal."""

import pytest
from harness import log_lines, messages
from harness.initiator import SESSIONS, T1, T2, session, store

ROOT = "/iscsi/initiator/id:1"
DISCOVER = "iscsiadm -m discovery -t sendtargets -p 10.9.1.2:3261 -I default > /tmp/remvol.tmp"
REFUSAL = f"{T1} is connecting, disconnect it before modifying its address."
NOT_FOUND = f"Can not find {T1} at IP: 10.9.1.2 Port: 3261"


@pytest.fixture(autouse=True)
def stored(box):
    store(box, T1, conn_set=1)
    box.forget()


def modify(box, name=T1, address="10.9.1.2", port="3261", status=0):
    done = box.remvol("--modify_address", "-n", name, "-i", address, "-p", port)
    assert done.status == status, done.stdout
    return done


def offer(box, text, status=0, connected=21):
    if connected == 21:
        box.fake("iscsiadm", "-m session", exact=True, status=21)
    box.fake("iscsiadm", "-m discovery", stdout=text, status=status)


def portal(box):
    return box.tree.get(f"{ROOT}/ip"), box.tree.get(f"{ROOT}/port")


def nothing_written(box):
    return [call for call in box.trace("set") if "/iscsi" in call] == []


def test_a_portal_that_offers_the_target_is_taken(box):
    offer(box, f"10.9.1.2:3261,1 {T2}\n10.9.1.2:3261,1 {T1}\n")
    done = modify(box)
    assert portal(box) == ("10.9.1.2", "3261")
    assert [call for call in box.trace("set") if "/iscsi" in call] == [
        f"set {ROOT}/ip=10.9.1.2",
        f"set {ROOT}/port=3261",
    ]
    assert box.shell() == [SESSIONS, SESSIONS, DISCOVER]
    assert done.stdout == "\n"
    assert not box.path("/tmp/remvol.tmp").exists()


def test_an_ipv6_portal(box):
    offer(box, f"[2001:db8::2]:3260,1 {T1}\n")
    modify(box, address="2001:db8::2", port="3260")
    assert portal(box) == ("[2001:db8::2]", "3260")


@pytest.mark.parametrize("port", ["0", "65536", "-1"])
def test_a_port_out_of_range(box, port):
    done = modify(box, port=port, status=255)
    assert "Port is not valid" in messages(done, "task_modify_target_address")
    assert nothing_written(box)


def test_an_empty_name(box):
    assert "): target name is not given\n" in modify(box, name="", status=255).stdout


def test_an_address_that_was_resolved_to_nothing(box):
    box.hook("inet_ntop", "AF_INET", ret=0)
    assert "): ip is not given\n" in modify(box, status=255).stdout


def test_an_unknown_target(box):
    done = modify(box, name=T2, status=255)
    assert done.stdout == f"\nTarget {T2} is not existed in configexecute failed.\n"
    assert nothing_written(box)


def test_a_connected_target_is_refused_with_success(box):
    box.fake("iscsiadm", "-m session", exact=True, stdout=session(T1))
    done = modify(box)
    assert done.stdout == f"\n{REFUSAL}"
    assert nothing_written(box)
    assert box.shell() == [SESSIONS]


def test_a_check_that_fails_is_refused_as_well(box):
    box.fake("iscsiadm", "-m session", exact=True, status=4)
    done = modify(box)
    assert REFUSAL in done.stdout
    assert nothing_written(box)
    assert box.shell() == [SESSIONS]


def test_a_target_that_connects_meanwhile_is_refused(box):
    box.tree.set("/iscsi/initiator/dbg", "1")
    box.fake("iscsiadm", "-m session", exact=True, status=21, times=1)
    box.fake("iscsiadm", "-m session", exact=True, stdout=session(T1))
    done = modify(box)
    assert f"{T1} is connecting." in messages(done, "Portal_search_target")
    assert REFUSAL in done.stdout
    assert box.shell() == [SESSIONS, SESSIONS]
    assert portal(box) == ("10.9.0.2", "3260")


@pytest.mark.parametrize(
    "text",
    [
        "",
        f"10.9.1.2:3261,1 {T2}\n",
        f"10.9.1.2:32610,1 {T1}\n",
        f"10.9.1.2:326,1 {T1}\n",
        f"10.9.0.2:3261,1 {T1}\n",
        f"iqn 10.9.1.2:3261,1 {T1}\n",
    ],
)
def test_a_portal_that_does_not_offer_the_target_is_refused_with_success(box, text):
    offer(box, text)
    done = modify(box)
    assert done.stdout == f"\n{NOT_FOUND}"
    assert nothing_written(box)
    assert not box.path("/tmp/remvol.tmp").exists()


def test_a_portal_that_cannot_be_asked_does_not_offer_it(box):
    box.tree.set("/iscsi/initiator/dbg", "2")
    offer(box, f"10.9.1.2:3261,1 {T1}\n", status=4)
    done = modify(box)
    assert f"): system() of cmd '{DISCOVER}' failed\n" in done.stdout
    assert f"): {NOT_FOUND}\n" in done.stdout
    assert portal(box) == ("10.9.0.2", "3260")


def test_an_answer_that_cannot_be_read_does_not_offer_it(box):
    box.tree.set("/iscsi/initiator/dbg", "1")
    box.fake("iscsiadm", "-m session", exact=True, status=21)
    box.fake("iscsiadm", "-m discovery", effect="rm /tmp/remvol.tmp")
    done = modify(box)
    assert "): discovery target failed at IP: 10.9.1.2 Port: 3261\n" in done.stdout
    assert NOT_FOUND in done.stdout
    assert portal(box) == ("10.9.0.2", "3260")


def test_an_address_that_cannot_be_written_leaves_the_port(box):
    offer(box, f"10.9.1.2:3261,1 {T1}\n")
    box.hook("ktreec_set", f"{ROOT}/ip", ret=-1)
    done = modify(box, status=255)
    assert "): ktreec_set() failed\n" in done.stdout
    assert portal(box) == ("10.9.0.2", "3260")
    assert f"set {ROOT}/port=3261" not in box.trace("set")


def test_a_port_that_cannot_be_written_leaves_the_new_address(box):
    box.tree.set("/iscsi/initiator/dbg", "1")
    offer(box, f"10.9.1.2:3261,1 {T1}\n")
    box.hook("ktreec_set", f"{ROOT}/port", ret=-1)
    done = modify(box, status=255)
    assert portal(box) == ("10.9.1.2", "3260")
    assert "): task_modify_target_ip end, ret = -103\n" in done.stdout


def test_the_steps_are_logged(box):
    box.tree.set("/iscsi/initiator/dbg", "2")
    offer(box, f"10.9.1.2:3261,1 {T1}\n")
    done = modify(box)
    functions = ("task_modify_target_address", "Portal_search_target")
    assert [text for _, function, text in log_lines(done.stdout) if function in functions] == [
        "task_modify_target_ip start",
        "ip: 10.9.1.2, port: 3261",
        f"get target at 10.9.1.2:3261,1 {T1}",
        "task_modify_target_ip end, ret = 0",
    ]
