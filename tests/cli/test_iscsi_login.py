"""Node records, login and logout, as `--connect`, `--disconnect` and `--search_lun` ask for them."""

import re

import pytest
from harness import log_lines, messages
from harness.initiator import (
    SESSIONS,
    DETAILS,
    SHARES,
    T1,
    Initiator,
    login_command,
    logout_command,
    record_commands,
    session,
    store,
)

ROOT = "/iscsi/initiator/id:1"
LUN1 = [("share1", 1)]
EXISTS = "iscsiadm: initiator reported error (15 - already exists)\n"
LOGOUT_AT_PORTAL = f'iscsiadm -m node -T "{T1}" -p 10.9.0.2:3260 --logout'
LOGIN_AGAIN = f'iscsiadm -m node -T "{T1}" -p 10.9.0.2:3260 -I default --login'


@pytest.fixture
def initiator(box):
    initiator = Initiator(box)
    initiator.offer(T1, {1: "sdb"})
    return initiator


def connect(box, status=0, **values):
    """Connects the stored target; its disk cannot be used, so nothing is mounted."""
    store(box, T1, conn_set=1, luns=LUN1, **values)
    box.hook("sys_check_dev", ret=1)
    box.forget()
    done = box.remvol("--connect", "-n", T1)
    assert done.status == status, done.stdout
    return done


def node_commands(box):
    return [command for command in box.shell() if "-m node" in command]


def test_the_node_record_is_built_from_scratch_before_every_login(box, initiator):
    connect(box)
    connect(box)
    assert node_commands(box) == [*record_commands(T1), login_command(T1)]


def test_the_record_carries_user_and_secret_for_chap(box, initiator):
    connect(box, chap=1, chap_name="user", chap_pwd="secret words")
    assert node_commands(box)[:5] == record_commands(T1, user="user", secret="secret words")
    password = next(run for run in box.runs("iscsiadm") if "node.session.auth.password" in run)
    assert password[-2:] == ["-v", "secret words"]


@pytest.mark.parametrize("chap", [0, 2, -1])
def test_chap_of_another_number_than_1_is_none(box, initiator, chap):
    connect(box, chap=chap, chap_name="user", chap_pwd="secret")
    assert node_commands(box)[:3] == record_commands(T1)


def test_failing_record_commands_are_logged_and_the_login_goes_on(box, initiator):
    box.fake("iscsiadm", re.compile("-o (delete|new|update)"), status=6)
    done = connect(box, chap=1, chap_name="user", chap_pwd="secret")
    records = record_commands(T1, user="user", secret="secret")
    assert node_commands(box) == [*records, login_command(T1)]
    masked = record_commands(T1, user="user", secret="***")
    assert re.findall(r"system\(\) of cmd '(.*)' failed", done.stdout) == masked
    assert box.tree.get(f"{ROOT}/conn_state") == "1"


def test_the_whole_road_of_a_connect(box, initiator):
    done = connect(box)
    assert done.status == 0
    calls = box.trace("system", "popen", "sleep", "set")
    login = calls.index(f"popen {login_command(T1)}")
    assert calls[login - 1] == f"set {ROOT}/conn_state=2"
    assert calls[login + 1 : login + 3] == [f"system {SESSIONS}"] * 2
    assert f"system {DETAILS}" in calls[login:]


# A login is judged by the listing: no exit status counts.
@pytest.mark.parametrize("status", [0, 15, 24, 255])
def test_the_session_is_there_whatever_the_login_reported(box, initiator, status):
    initiator.log_in(T1)
    box.fake("iscsiadm", re.compile("--login$"), status=status)
    connect(box)
    assert box.tree.get(f"{ROOT}/status") == "Connected"


def test_a_login_that_reports_success_without_a_session_failed(box, initiator):
    box.fake("iscsiadm", re.compile("--login$"), status=0)
    done = connect(box, status=255)
    assert re.search(
        rf"^\(src\.cpp:_target_connect_run:\d+\): Can not find target {T1} in session\n, connect failed\.$",
        done.stdout,
        re.M,
    )
    assert box.tree.get(f"{ROOT}/conn_state") == "4"


def test_at_start_up_the_message_of_a_failed_login_names_no_target(box, initiator):
    initiator.offer(T1, refuse=24)
    box.tree.set("/iscsi/initiator/ver", "1")
    store(box, T1, conn_set=1)
    for command in ("killall", "rmmod", "insmod", "iscsid"):
        box.default(command)
    done = box.remvol("--init")
    box.wait_quiet()
    assert "): Can not find target  in session\n, connect failed.\n" in done.stdout


def test_a_session_that_goes_before_the_second_look_is_no_connection(box, initiator):
    box.fake("iscsiadm", "-m session", exact=True, stdout=session(T1), skip=1, times=1)
    box.fake("iscsiadm", "-m session", exact=True, status=21)
    done = connect(box, status=255)
    assert any(text.startswith("Can not find target") for text in messages(done, "Target_Connect"))


def test_a_stale_session_of_the_older_system_is_replaced(box, initiator):
    box.fake("iscsiadm", re.compile("--login$"), stdout="Logging in\n" + EXISTS + "more\n", status=15, times=1)
    box.fake("iscsiadm", re.compile("--logout$"))
    connect(box)
    assert node_commands(box)[3:] == [login_command(T1), LOGOUT_AT_PORTAL, LOGIN_AGAIN]
    assert box.tree.get(f"{ROOT}/status") == "Connected"


def test_the_end_of_the_first_login_is_waited_for(box, initiator):
    late = f"echo '{EXISTS.strip()}'; sleep 0.3; touch /fake/initiator/on/{T1}"
    box.fake("iscsiadm", re.compile("--login$"), effect=late, times=1)
    box.fake("iscsiadm", re.compile("--log(in|out)$"))
    connect(box)
    assert box.tree.get(f"{ROOT}/status") == "Connected"


def test_failures_of_the_replacement_are_logged_and_stop_nothing(box, initiator):
    box.fake("iscsiadm", re.compile("--login$"), stdout=EXISTS)
    box.fake("iscsiadm", re.compile("--logout$"), status=10)
    box.fake("iscsiadm", re.compile("--login$"), status=15)
    initiator.log_in(T1)
    box.hook("system", LOGIN_AGAIN, ret=15 << 8)
    done = connect(box)
    failed = re.findall(r"system\(\) of cmd '(.*)' failed", done.stdout)
    assert failed == [LOGOUT_AT_PORTAL, LOGIN_AGAIN]


# The text of 2.0.874 and later, on standard error: the session stays, its disks may be mounted.
def test_a_present_session_of_a_current_system_is_left_alone(box, initiator):
    initiator.log_in(T1)
    text = "iscsiadm: default: 1 session requested, but 1 already present.\niscsiadm: Could not log into all portals\n"
    box.fake("iscsiadm", re.compile("--login$"), stderr=text, status=15)
    connect(box)
    assert node_commands(box)[3:] == [login_command(T1)]
    assert initiator.sessions() == [T1]


def test_the_login_command_is_logged(box, initiator):
    box.tree.set("/iscsi/initiator/dbg", "1")
    done = connect(box)
    assert f"): try to login - cmd: {login_command(T1)} \n\n" in done.stdout


@pytest.mark.parametrize("port", [0, 65536, -1])
def test_a_port_out_of_range_is_not_logged_in_to(box, initiator, port):
    connect(box, status=255, port=port)
    assert not [command for command in box.shell() if "--login" in command]
    assert box.tree.get(f"{ROOT}/conn_state") == "4"


def test_a_login_that_cannot_be_started_failed(box, initiator):
    box.hook("popen", login_command(T1), ret=-1)
    connect(box, status=255)
    assert box.tree.get(f"{ROOT}/conn_state") == "4"


def test_an_unreachable_portal_is_a_connect_error(box, initiator):
    initiator.offer(T1, refuse=8)
    connect(box, status=255)
    assert box.tree.get("/result/connect") == "-1"
    assert box.tree.get(f"{ROOT}/conn_state") == "4"


def test_a_missing_iscsiadm_is_a_connect_error(box, initiator):
    box.path("/fake/bin/iscsiadm").unlink()
    box.run(["rm", "-f", "/usr/bin/iscsiadm", "/usr/sbin/iscsiadm"])
    done = connect(box, status=255)
    assert f"system() of cmd '{SESSIONS}' failed" in done.stdout
    assert box.tree.get(f"{ROOT}/conn_state") == "4"


def test_a_target_without_address_gets_no_record_and_no_login(box, initiator):
    connect(box, status=255, ip=None)
    assert node_commands(box) == []


def test_a_name_of_255_characters_fits_every_command(box):
    name = "iqn.2026-01.org.example:" + "n" * 231
    assert len(name) == 255
    initiator = Initiator(box)
    initiator.offer(name, {1: "sdb"})
    store(box, name, conn_set=1, luns=LUN1)
    box.hook("sys_check_dev", ret=1)
    done = box.remvol("--connect", "-n", name)
    assert done.status == 0
    assert box.tree.get(f"{ROOT}/status") == "Connected"
    assert box.tree.get(f"{ROOT}/lun/id:1/dev") == "sdb"


# --- which interface ---


def choose(box, address, *, bonding=None, links=(), answering=()):
    """Connects to a portal; gives the interface of its node record and the pings."""
    initiator = Initiator(box)
    initiator.offer(T1, {1: "sdb"})
    if bonding is not None:
        box.tree.set("/network_mgr/bonding/enable", bonding)
    for port in (0, 1):
        box.hook("LIB_Get_Lan_Link_Speed", str(port), ret=1000 if port in links else 0)
    box.fake("ping", re.compile("-I (%s) " % "|".join([*answering, "none"])))
    box.fake("ping", status=1)
    done = connect(box, ip=address)
    login = next(command for command in box.shell() if "--login" in command)
    return login.split(" -I ")[1].split()[0], [" ".join(run) for run in box.runs("ping")], done


def ping(netif, address="fe80::1"):
    return f"-6 -W 1 -c 2 -I {netif} {address}"


@pytest.mark.parametrize("address", ["10.9.0.2", "[2001:db8::1]", "[fd00:9::2]", "[fe80:0:0:1::1]", "fe80:0:0:1::1"])
def test_other_addresses_than_link_local_take_the_default(box, address):
    assert choose(box, address, bonding="1", links=(0, 1))[:2] == ("default", [])


@pytest.mark.parametrize("address", ["fe80::1", "[fe80::1]", "[febf::2]"])
def test_link_local_with_bonding_takes_the_bond(box, address):
    assert choose(box, address, bonding="1", links=(0, 1))[:2] == ("ifbond", [])


@pytest.mark.parametrize("value", ["7", "-1"])
def test_any_number_but_zero_is_bonding(box, value):
    assert choose(box, "[fe80::1]", bonding=value)[0] == "ifbond"


@pytest.mark.parametrize(
    "links, answering, iface, pings",
    [
        ((0, 1), ["egiga0", "egiga1"], "iface0", ["egiga0"]),
        ((0, 1), ["egiga1"], "iface1", ["egiga0", "egiga1"]),
        ((0, 1), [], "iface0", ["egiga0", "egiga1"]),
        ((1,), ["egiga0", "egiga1"], "iface1", ["egiga1"]),
        ((1,), [], "iface0", ["egiga1"]),
        ((0,), ["egiga1"], "iface0", ["egiga0"]),
        ((), ["egiga0", "egiga1"], "iface0", []),
    ],
)
def test_link_local_takes_the_port_from_which_the_portal_answers(box, links, answering, iface, pings):
    found = choose(box, "[fe80::1]", bonding="0", links=links, answering=answering)
    assert found[:2] == (iface, [ping(netif) for netif in pings])


def test_unknown_bonding_counts_as_none_and_is_said(box):
    iface, pings, done = choose(box, "[fe80::1]", links=(0,), answering=["egiga0"])
    assert iface == "iface0"
    assert "_ktree_get_bonding_mode_enable" in done.stdout and "get bonding mode status failed" in done.stdout


def test_the_choice_is_made_once_a_run_and_logged(box):
    box.tree.set("/iscsi/initiator/dbg", "2")
    _, pings, done = choose(box, "[fe80::1]", bonding="0", links=(0,), answering=["egiga0"])
    assert pings == [ping("egiga0")]
    texts = [text for _, function, text in log_lines(done.stdout) if function.endswith("get_iface_name")]
    assert texts[:6] == [
        "_get_iface_name get iface name , 32 ,[fe80::1]",
        "ping_ip [fe80::1] from egiga0",
        "ping_ip [fe80::1] from egiga0 successed",
        "_get_iface_name get iface name = iface0",
        "set iface name = iface0",
        "set iface name = iface0",
    ]


# --- disconnect ---


def disconnect(box, **values):
    store(box, T1, conn_set=1, luns=[("share1", 1, {"dev": "sdb"})], **values)
    box.forget()
    return box.remvol("--disconnect", "-n", T1)


def test_the_steps_of_a_disconnect(box, initiator):
    initiator.log_in(T1)
    box.default("fuser")
    other = "iqn.other"
    initiator.offer(other, {1: "sdz"})
    initiator.log_in(other)
    done = disconnect(box)
    assert done.status == 0
    calls = box.trace("system", "set")
    reload = calls.index(f"system {SHARES}")
    assert calls[reload : reload + 7] == [
        f"system {SHARES}",
        f"system {logout_command(T1)}",
        f"set {ROOT}/conn_state=0",
        f"set {ROOT}/conn_set=0",
        f"system {DETAILS}",
        f"set {ROOT}/lun/id:1/dev=",
        f"system {SESSIONS}",
    ]
    assert box.tree.get(f"{ROOT}/conn_set") == "0"
    assert box.tree.get(f"{ROOT}/status") == "Disconnected"


def test_the_last_session_leaves_the_device_names(box, initiator):
    initiator.log_in(T1)
    box.default("fuser")
    disconnect(box)
    assert box.tree.get(f"{ROOT}/lun/id:1/dev") == "sdb"


def test_a_failed_logout_still_marks_the_target_disconnected(box, initiator):
    box.default("fuser")
    done = disconnect(box)
    assert f"system() of cmd '{logout_command(T1)}' failed" in done.stdout
    assert box.tree.get(f"{ROOT}/conn_state") == "0"
    assert box.tree.get(f"{ROOT}/conn_set") == "0"


def test_the_steps_of_a_disconnect_are_logged(box, initiator):
    box.tree.set("/iscsi/initiator/dbg", "2")
    initiator.log_in(T1)
    box.default("fuser")
    done = disconnect(box)
    texts = messages(done, "Target_Disconnect")
    assert texts == ["start", "update share folder status", "finish share folder status", "logout start",
                     "logout end ", "end"]


def test_a_connect_without_a_disk_logs_out_and_stays_so(box, initiator):
    initiator.offer(T1, {0: None})
    connect(box, status=255)
    assert logout_command(T1) in box.shell()
    assert box.tree.get(f"{ROOT}/conn_set") == "0"
    assert initiator.sessions() == []
