"""`--init`: the initiator brought up."""

import re

import pytest
from harness import messages
from harness.initiator import (
    BASE,
    SESSIONS,
    DETAILS,
    SHARES,
    T1,
    T2,
    T3,
    Initiator,
    block,
    login_command,
    logout_command,
    record_commands,
    store,
)

MODULES = ["iscsi_tcp.ko", "libiscsi_tcp.ko", "libiscsi.ko", "scsi_transport_iscsi.ko"]
SETTINGS = """node.startup = manual
node.session.timeo.replacement_timeout = 30
node.session.initial_login_retry_max = 5
node.conn[0].timeo.login_timeout = 10
node.conn[0].timeo.logout_timeout = 15
node.conn[0].timeo.noop_out_interval = 5
node.conn[0].timeo.noop_out_timeout = 5
node.session.err_timeo.abort_timeout = 15
node.session.err_timeo.lu_reset_timeout = 20
"""
ECHO_SETTINGS = 'echo -e "' + SETTINGS.replace("\n", r"\n") + '" > /etc/iscsi/iscsid.conf'
LUN1 = [("share1", 1)]
START_ISCSID = "iscsid -f >/dev/null 2>&1 &"
NAME = "iqn.2013-03.org.example:nas-box:initiator-1b2c3d"
START_TREE = [
    "system ktree -n config -s /var/run/ktree_sock_vv 1>/dev/null 2>/dev/null &",
    "sleep 1",
    "system ktreec -S /var/run/ktree_sock_vv -l /etc/NAS_CFG/vv.xml",
]


def system(*commands):
    return [f"system {command}" for command in commands]


def iface(name, netif):
    return [
        f"iscsiadm -m iface -I {name} --op=new",
        f'iscsiadm -m iface -I {name} --op=update -n iface.net_ifacename -v "{netif}"',
    ]


IFACES = iface("iface0", "egiga0") + iface("iface1", "egiga1") + iface("ifbond", "bond0")


def bring_up(name=NAME, ifaces=IFACES):
    """The commands of a start-up up to the targets."""
    return system(
        "killall -q -SIGTERM iscsid",
        *(f"rmmod {module} 1>/dev/null 2>/dev/null" for module in MODULES),
        *(f"insmod /usr/local/modules/driver/{module}" for module in reversed(MODULES)),
        "mkdir -p /etc/iscsi",
        ECHO_SETTINGS,
        f"echo 'InitiatorName={name}' > /etc/iscsi/initiatorname.iscsi",
        START_ISCSID,
        *ifaces,
    )


def appliance(box):
    """What an appliance that has just booted answers."""
    box.hook("sys_hostname", out="NAS-Box")
    box.hook("sys_get_mac_addr", "egiga0", out="00:90:A9:1B:2C:3D")
    box.hook("sys_get_mac_addr", "egiga1", out="00:90:A9:1B:2C:3E")
    box.hook("sleep", "1", effect="until [ -S /var/run/ktree_sock_vv ]; do sleep 0.01; done")
    box.default("killall", status=1)
    box.default("rmmod", status=1, stderr="rmmod: ERROR: not loaded\n")
    box.default("insmod")
    box.default("iscsid")
    return Initiator(box)


@pytest.fixture
def initiator(box):
    return appliance(box)


def init(box):
    done = box.remvol("--init")
    box.wait_quiet()
    assert done.status == 0, done.stdout
    assert box.tree.get("/result/init") == "0"
    return done


def test_a_bare_appliance_is_brought_up_step_by_step(bare_box):
    box = bare_box
    appliance(box)
    done = init(box)
    assert box.trace() == START_TREE + bring_up()
    assert box.path("/etc/iscsi/iscsid.conf").read_text() == SETTINGS
    assert box.path("/etc/iscsi/initiatorname.iscsi").read_text() == f"InitiatorName={NAME}\n"
    assert box.tree.get("/iscsi/initiator/iqn") == NAME
    assert box.tree.get("/iscsi/initiator/ver") == "1"
    assert box.tree.get("/iscsi/initiator/count") == "0"
    failures = re.findall(r"system\(\) of cmd '(.*)' failed", done.stdout)
    assert failures == [START_TREE[2].removeprefix("system "), "killall -q -SIGTERM iscsid"]


def test_the_saved_settings_are_loaded_into_the_fresh_tree(bare_box):
    box = bare_box
    appliance(box)
    prefix = "<prefix>iqn.2000-01.org.example:</prefix><ver>1</ver>"
    box.write("/etc/NAS_CFG/vv.xml", f"<config><iscsi><initiator>{prefix}</initiator></iscsi></config>")
    box.hook("sys_hostname", out="Box", first=True)
    init(box)
    assert box.tree.get("/iscsi/initiator/iqn") == "iqn.2000-01.org.example:box:initiator-1b2c3d"


def test_a_running_tree_is_neither_started_nor_loaded(box, initiator):
    box.write("/etc/NAS_CFG/vv.xml", "<config><iscsi><initiator><prefix>saved:</prefix></initiator></iscsi></config>")
    init(box)
    assert box.trace() == bring_up()
    assert box.tree.get("/iscsi/initiator/prefix") is None


def test_settings_of_the_old_layout_are_upgraded_before_anything_is_loaded(box, initiator):
    box.tree.set({"/iscsi/initiator/id:1/target": T1, "/iscsi/initiator/id:1/share": "old",
                  "/iscsi/initiator/count": "1"})
    init(box)
    assert box.tree.get("/iscsi/initiator/ver") == "1"
    assert box.tree.get("/iscsi/initiator/id:1/lun/id:1/share") == "old"
    sets = box.trace("set", "run")
    assert sets.index("set /iscsi/initiator/ver=1") < sets.index("run killall -q -SIGTERM iscsid")


@pytest.mark.parametrize("function, key", [("ktreec_get_wb", "count"), ("ktreec_get_wb", "id:1/share"),
                                           ("ktreec_get_wb", "id:1/format_state"), ("ktreec_set", "id:1/lun/count"),
                                           ("ktreec_set", "id:1/lun/id:1/lun"), ("ktreec_set", "id:1/lun/id:1/enable"),
                                           ("ktreec_set", "id:1/lun/id:1/share"), ("ktreec_set", "id:1/lun/id:1/format_state")])
def test_one_access_that_fails_ends_no_upgrade(box, initiator, function, key):
    """It is not tried again: the version is the new one, whatever came of it."""
    box.tree.set({"/iscsi/initiator/id:1/target": T1, "/iscsi/initiator/id:1/share": "old",
                  "/iscsi/initiator/id:1/format_state": "3", "/iscsi/initiator/count": "1"})
    box.hook(function, f"/iscsi/initiator/{key}", ret=-1, times=1)
    init(box)
    lun = {name: box.tree.get(f"/iscsi/initiator/id:1/lun/id:1/{name}") for name in ("lun", "enable", "share", "format_state")}
    assert lun == {"lun": "0", "enable": "1", "share": "old", "format_state": "3"}


def test_current_settings_are_not_converted(box, initiator):
    box.tree.set({"/iscsi/initiator/ver": "1", "/iscsi/initiator/id:1/target": T1,
                  "/iscsi/initiator/id:1/share": "old", "/iscsi/initiator/count": "1",
                  "/iscsi/initiator/id:1/ip": "10.9.0.2", "/iscsi/initiator/id:1/port": "3260"})
    init(box)
    assert box.tree.get("/iscsi/initiator/id:1/lun/id:1/share") is None


def test_every_failure_is_logged_and_the_next_step_runs(box, initiator):
    for command in ("insmod", "iscsiadm"):
        box.fake(command, status=1)
    box.write("/etc/iscsi", "not a folder")
    done = init(box)
    assert box.trace() == bring_up()
    failures = re.findall(r"^\(src\.cpp:\w+:\d+\): system\(\) of cmd '(.*)' failed$", done.stdout, re.M)
    expected = [call.removeprefix("system ") for call in bring_up() if "rmmod" not in call]
    expected.remove(START_ISCSID)
    assert failures == expected
    assert box.tree.get("/iscsi/initiator/iqn") == NAME


@pytest.mark.parametrize("place", ["/etc/iscsi", "/var/lib/iscsi"])  # open-iscsi until 2.1.9, and later
def test_records_that_a_power_cut_left_empty_are_removed(box, initiator, place):
    folder = f"{place}/nodes/iqn.2026-01.org.example:t1"
    empty = [f"{folder}/10.9.0.2,3260", f"{folder}/10.9.1.2,3260,1/iface0", f"{place}/ifaces/iface1"]
    whole = [f"{folder}/10.9.0.3,3260", f"{place}/ifaces/iface0"]
    for path in empty:
        box.write(path, "")
    for path in whole:
        box.write(path, "# BEGIN RECORD 2.1.8\n")
    box.path(f"{place}/ifaces/link").symlink_to(f"{place}/elsewhere")
    box.write(f"{place}/elsewhere", "")
    done = init(box)
    assert box.trace() == bring_up()
    assert [path for path in empty if box.path(path).exists()] == []
    assert sorted(re.findall(r": the empty record (\S+) is removed", done.stdout)) == sorted(empty)
    assert all(box.path(path).exists() for path in [*whole, f"{place}/elsewhere"])
    assert box.path(f"{place}/ifaces/link").is_symlink()


def test_missing_modules_and_a_missing_iscsiadm_leave_a_clear_state(box, initiator):
    box.tree.set("/iscsi/initiator/ver", "1")
    store(box, T1, conn_set=1, luns=LUN1)
    box.fake("insmod", status=1, stderr="insmod: ERROR: could not load module\n")
    box.path("/fake/bin/iscsiadm").unlink()
    box.run(["rm", "-f", "/usr/bin/iscsiadm", "/sbin/iscsiadm", "/usr/sbin/iscsiadm"])
    done = init(box)
    assert f"system() of cmd 'insmod /usr/local/modules/driver/{MODULES[3]}' failed" in done.stdout
    assert box.path("/etc/iscsi/iscsid.conf").read_text() == SETTINGS
    assert box.tree.get("/iscsi/initiator/id:1/conn_state") == "4"
    assert box.tree.get("/iscsi/initiator/id:1/status") == "Connect Error"
    assert box.tree.get("/iscsi/initiator/id:1/conn_set") == "1"


@pytest.mark.parametrize("shell", ["dash", "bash"])
def test_the_daemons_configuration_holds_the_nine_settings_whatever_the_shell(box, initiator, shell):
    box.run(["ln", "-sf", shell, "/usr/bin/sh"])
    init(box)
    text = box.path("/etc/iscsi/iscsid.conf").read_text()
    assert text.rstrip("\n") + "\n" == SETTINGS
    assert ECHO_SETTINGS in box.shell()


def test_what_stood_in_the_daemons_configuration_is_replaced(box, initiator):
    box.write("/etc/iscsi/iscsid.conf", SETTINGS + "node.startup = automatic\n")
    init(box)
    assert box.path("/etc/iscsi/iscsid.conf").read_text() == SETTINGS


def test_a_configuration_that_cannot_be_written_is_said(box, initiator):
    box.path("/etc/iscsi/iscsid.conf").mkdir(parents=True)
    done = init(box)
    assert "write /etc/iscsi/iscsid.conf failed" in done.stdout
    assert box.path("/etc/iscsi/initiatorname.iscsi").exists()


NAMES = {
    "default prefix": ("", "NAS-Box", "00:90:A9:1B:2C:3D", NAME),
    "stored prefix": ("iqn.2000-01.org.example:", "Box", "00:90:A9:1B:2C:3D",
                      "iqn.2000-01.org.example:box:initiator-1b2c3d"),
    "no host name": ("", None, "00:90:A9:1B:2C:3D", "iqn.2013-03.org.example:initiator-1b2c3d"),
    "no hardware address": ("", "NAS-Box", None, "iqn.2013-03.org.example:nas-box:initiator"),
    "nothing": ("", None, None, "iqn.2013-03.org.example:initiator"),
    "too long": ("p" * 250, "NAS-Box", "00:90:A9:1B:2C:3D", "p" * 250 + "nas-b"),
}


@pytest.mark.parametrize("prefix, host, mac, name", NAMES.values(), ids=NAMES)
def test_the_initiator_name(box, prefix, host, mac, name):
    box.tree.set("/iscsi/initiator/prefix", prefix)
    box.hook("sys_hostname", **({"ret": -1} if host is None else {"out": host}))
    box.hook("sys_get_mac_addr", **({"ret": -1} if mac is None else {"out": mac}))
    appliance(box)
    done = init(box)
    assert box.tree.get("/iscsi/initiator/iqn") == name
    assert box.path("/etc/iscsi/initiatorname.iscsi").read_text() == f"InitiatorName={name}\n"
    assert ("ERROR : get lan1 mac from ktree failed" in done.stdout) == (mac is None)


def test_the_steps_of_the_name_are_logged(box, initiator):
    box.tree.set("/iscsi/initiator/dbg", "2")
    done = init(box)
    for function, text in [
        ("task_init", "start"),
        ("task_init", "strNode: /iscsi/initiator/prefix"),
        ("get_mac_as_unique_name", "LAN1 mac = 00:90:A9:1B:2C:3D"),
        ("get_mac_as_unique_name", "unique_name = 1b2c3d"),
        ("Target_load_all", "start"),
        ("Target_load_all", "end"),
        ("task_init", "end"),
    ]:
        assert text in messages(done, function)


def test_a_port_without_hardware_address_gets_no_record(box, initiator):
    box.hook("sys_get_mac_addr", "egiga1", ret=-1, first=True)
    init(box)
    assert box.trace() == bring_up(ifaces=iface("iface0", "egiga0") + iface("ifbond", "bond0"))
    box.forget()
    box.hook("sys_get_mac_addr", ret=-1, first=True)
    init(box)
    assert not [command for command in box.shell() if "-m iface" in command]


def test_only_the_update_decides_over_an_interface_record(box, initiator):
    box.fake("iscsiadm", re.compile("--op=new$"), status=15)
    done = init(box)
    assert f"system() of cmd '{IFACES[0]}' failed" in done.stdout
    assert "_set_iface_config iface" not in done.stdout
    box.fake("iscsiadm", re.compile("--op=update"), status=6)
    done = init(box)
    assert f"system() of cmd '{IFACES[1]}' failed" in done.stdout
    assert "_set_iface_config iface0 00:90:A9:1B:2C:3D egiga0 failed" in done.stdout
    assert "_set_iface_config iface1 00:90:A9:1B:2C:3E\n egiga1 failed" in done.stdout
    assert "_set_iface_config ifbond 00:90:A9:1B:2C:3D bond0 failed" in done.stdout


def test_the_second_octet_stands_in_lower_case(box, initiator):
    box.fake("iscsiadm", re.compile("--op=update"), status=6)
    box.hook("sys_get_mac_addr", "egiga0", out="AA:BB:CC:DD:EE:FF", first=True)
    assert "_set_iface_config iface0 AA:bb:CC:DD:EE:FF egiga0 failed" in init(box).stdout


# iscsid sends the signal that stops it to its whole process group.
def test_a_stopping_iscsid_takes_nothing_along(bare_box):
    box = bare_box
    appliance(box)
    box.fake("iscsid", effect="kill -TERM 0")
    script = "remvol --init >/dev/null && ktreec -S /var/run/ktree_sock_vv -g /result/init && echo alive"
    for leader in ([], ["setsid", "-w"]):
        done = box.run([*leader, "sh", "-c", script])
        box.wait_quiet()
        assert done.stdout == "0\nalive\n"


HOLDS_NAME = """
import os, socket, time
held = socket.socket(socket.AF_UNIX)
held.bind("\\0ISCSIADM_ABSTRACT_NAMESPACE")
held.listen()
print("held", flush=True)
while not os.path.exists("/fake/end"): time.sleep(0.01)
"""


def hold_name(box):
    """The iscsid that was told to end has not ended yet."""
    holder = box.start(["/usr/bin/python3", "-c", HOLDS_NAME], env={"LD_PRELOAD": None})
    box.wait_until(lambda: holder.stdout == "held\n")
    box.fake("iscsid", effect="grep -c ISCSIADM_ABSTRACT_NAMESPACE /proc/net/unix >/fake/held")
    return holder


def test_iscsid_is_started_when_the_one_before_has_ended(initiator, box):
    holder = hold_name(box)
    box.hook("usleep", "50000", effect="touch /fake/end")
    done = init(box)
    holder.wait()
    assert box.path("/fake/held").read_text() == "0\n"
    assert "usleep 50000" in box.trace("usleep")
    assert "has not ended" not in done.stdout


def test_an_iscsid_that_does_not_end_is_waited_for_ten_seconds(initiator, box):
    holder = hold_name(box)
    done = box.remvol("--init")
    assert done.status == 0
    assert box.trace("usleep") == ["usleep 50000"] * 200
    assert "the iscsid that was told to end has not ended" in done.stdout
    held = box.path("/fake/held")
    box.wait_until(lambda: held.exists() and held.read_text() == "1\n")
    holder.kill(9)
    holder.wait()


def test_without_an_iscsid_nothing_is_waited_for(initiator, box):
    init(box)
    assert box.trace("usleep") == []


def test_each_daemon_has_a_process_group_of_its_own_even_when_the_tool_leads_a_session(bare_box):
    box = bare_box
    appliance(box)
    box.fake("iscsid", effect="cut -d' ' -f5 /proc/self/stat >/fake/group")
    done = box.run(["setsid", "-w", "remvol", "--init"])
    box.wait_quiet()
    assert done.status == 0
    stats = [entry for entry in box.path("/proc").iterdir() if entry.name.isdigit()]
    groups = {(entry / "comm").read_text().strip(): (entry / "stat").read_text().split(") ")[1].split()[2]
              for entry in stats}
    iscsid_group = box.path("/fake/group").read_text().strip()
    assert len({groups["ktree"], iscsid_group, "0", "1"}) == 4


# --- the stored targets ---

def load(box, targets):
    """Stores the targets, a name and its values a slot, and runs --init."""
    box.tree.set("/iscsi/initiator/ver", "1")
    for slot, (name, values) in targets.items():
        store(box, name, slot=slot, **{"conn_set": 1, **values})
    return init(box)


def state(box, slot):
    root = f"/iscsi/initiator/id:{slot}"
    return [box.tree.get(f"{root}/{key}") for key in ("conn_state", "status", "conn_set")]


def after_ifaces(box, *kinds):
    """The calls behind those that bring the initiator up."""
    calls = box.trace(*kinds)
    last = max(at for at, call in enumerate(calls) if "-m iface" in call)
    return calls[last + 1 :]


def test_a_good_an_off_and_a_refusing_target(box, initiator):
    initiator.offer(T1, {1: "sdb"})
    initiator.offer(T2, {1: "sdc"})
    initiator.offer(T3, {1: "sdd"}, refuse=24)
    box.hook("sys_check_dev", ret=1)
    load(box, {1: (T1, {"luns": LUN1}), 2: (T2, {"conn_set": 0, "luns": LUN1}), 3: (T3, {"luns": LUN1})})
    assert state(box, 1) == ["1", "Connected", "1"]
    assert state(box, 2) == ["0", "Disconnected", "0"]
    assert state(box, 3) == ["4", "Connect Error", "1"]
    assert initiator.sessions() == [T1]
    assert box.tree.get("/iscsi/initiator/id:1/lun/id:1/dev") == "sdb"
    assert box.tree.get("/iscsi/initiator/count") == "3"
    calls = after_ifaces(box)
    first = [*system(*record_commands(T1)), f"popen {login_command(T1)}", *system(SESSIONS, SESSIONS, DETAILS), "sleep 1"]
    assert calls[: len(first)] == first
    reload = calls.index(f"system {SHARES}")
    second = [*system(*record_commands(T2), SESSIONS)]
    third = [*system(*record_commands(T3)), f"popen {login_command(T3)}", *system(SESSIONS, SESSIONS)]
    assert calls[reload - len(second + third) : reload + 1] == second + third + [f"system {SHARES}"]
    assert calls.count(f"system {SHARES}") == 1


def test_nothing_mounted_reloads_no_share(box, initiator):
    initiator.offer(T1, refuse=24)
    load(box, {1: (T1, {})})
    assert SHARES not in box.shell()


def test_a_filled_slot_behind_an_empty_one_is_loaded(box, initiator):
    initiator.offer(T1, {1: "sdb"})
    box.hook("sys_check_dev", ret=1)
    load(box, {4: (T1, {"luns": LUN1})})
    assert state(box, 4) == ["1", "Connected", "1"]
    assert login_command(T1) in box.shell()
    assert box.tree.get("/iscsi/initiator/count") == "1"


def test_the_same_name_in_two_slots_is_loaded_by_slot(box, initiator):
    initiator.offer(T1, {1: "sdb"})
    box.hook("sys_check_dev", ret=1)
    load(box, {1: (T1, {"conn_set": 0, "luns": LUN1}), 3: (T1, {"luns": LUN1})})
    assert box.tree.get("/iscsi/initiator/id:3/lun/id:1/dev") == "sdb"


def test_the_connect_state_goes_over_connecting(box, initiator):
    initiator.offer(T1, {1: "sdb"})
    box.hook("sys_check_dev", ret=1)
    load(box, {1: (T1, {"luns": LUN1})})
    calls = after_ifaces(box, "set", "popen", "system")
    connecting = calls.index("set /iscsi/initiator/id:1/conn_state=2")
    assert calls.index(f"popen {login_command(T1)}") == connecting + 1


def test_a_session_without_disk_is_given_up(box, initiator):
    initiator.offer(T1, {0: None, 1: ("sdb", "blocked")})
    load(box, {1: (T1, {"luns": [*LUN1, ("share2", 2)]})})
    assert state(box, 1) == ["0", "Disconnected", "0"]
    assert [box.tree.get(f"/iscsi/initiator/id:1/lun/id:{m}/volume_state") for m in (1, 2)] == ["4", "4"]
    assert initiator.sessions() == []
    assert after_ifaces(box) == [
        *system(*record_commands(T1)),
        f"popen {login_command(T1)}",
        *system(SESSIONS, SESSIONS, DETAILS, logout_command(T1), SESSIONS),
    ]


def test_why_a_session_was_given_up_is_logged(box, initiator):
    box.tree.set("/iscsi/initiator/dbg", "1")
    initiator.offer(T1, {1: None})
    done = load(box, {1: (T1, {"luns": LUN1})})
    assert f"): Can not find Device for Target: {T1} on iscsiadm -m session\n" in done.stdout
    # Written although, and only when, the logout worked.
    assert f"): Logout Fail on Target: {T1} \n" in done.stdout
    initiator.offer(T1, {1: None})
    box.fake("iscsiadm", "-m session -P3", stdout="Target: iqn.other\n")
    box.fake("iscsiadm", re.compile("--logout"), status=10)
    box.tree.set("/iscsi/initiator/id:1/conn_set", "1")
    done = init(box)
    assert f"): Can not find Target: {T1} on iscsiadm -m session\n" in done.stdout
    assert "Logout Fail" not in done.stdout
    assert state(box, 1) == ["1", "Connected", "0"]


def test_a_device_name_that_cannot_be_stored_gives_the_session_up(box, initiator):
    initiator.offer(T1, {1: "sdb"})
    box.hook("ktreec_set", "/iscsi/initiator/id:1/lun/id:1/dev", value="sdb", ret=-1)
    done = load(box, {1: (T1, {"luns": LUN1})})
    assert "): ktree failed\n" in done.stdout
    assert state(box, 1) == ["0", "Disconnected", "0"]


def test_a_failing_listing_gives_the_session_up_without_a_reason(box, initiator):
    initiator.offer(T1, {1: "sdb"})
    box.tree.set("/iscsi/initiator/dbg", "1")
    box.fake("iscsiadm", "-m session -P3", status=4)
    done = load(box, {1: (T1, {"luns": LUN1})})
    assert f"system() of cmd '{DETAILS}' failed" in done.stdout
    assert "Can not find Device" not in done.stdout and "ktree failed" not in done.stdout
    assert state(box, 1) == ["0", "Disconnected", "0"]


def test_all_eight_slots_are_visited(box, initiator):
    for slot in range(1, 9):
        initiator.offer(f"{BASE}n{slot}", {1: f"sd{'abcdefgh'[slot - 1]}"})
    box.hook("sys_check_dev", ret=1)
    load(box, {slot: (f"{BASE}n{slot}", {"luns": LUN1}) for slot in range(1, 9)})
    assert [state(box, slot)[1] for slot in range(1, 9)] == ["Connected"] * 8
    assert box.trace("sleep").count("sleep 1") >= 8


def test_init_again_on_a_running_appliance(box, initiator):
    initiator.offer(T1, {1: "sdb"})
    box.hook("sys_check_dev", ret=1)
    load(box, {1: (T1, {"luns": LUN1})})
    initiator.offer(T1, {1: "sdb"}, refuse=15)  # 2.1.8 refuses a second login; the session is there
    init(box)
    assert state(box, 1) == ["1", "Connected", "1"]
    assert logout_command(T1) not in box.shell()


def test_sessions_that_the_new_daemon_takes_over_are_waited_for(box, initiator):
    initiator.offer(T1, {1: "sdb"})
    box.hook("sys_check_dev", ret=1)
    box.hook("sys_mount_point", "/mnt/VV/share1", ret=1)
    lost = block(T1, {1: ("sdb", "blocked")}, state="FAILED")
    box.fake("iscsiadm", "-m session -P3", stdout=lost, times=1)
    box.fake("iscsiadm", "-m session -P 3", stdout=lost, times=3)
    load(box, {1: (T1, {"luns": LUN1})})
    assert state(box, 1) == ["1", "Connected", "1"]
    assert box.tree.get("/iscsi/initiator/id:1/lun/id:1/dev") == "sdb"
    assert logout_command(T1) not in box.shell()
    assert len([call for call in box.shell() if "-m session -P 3 " in call]) == 4


def test_sessions_that_do_not_come_back_are_given_up_after_thirty_seconds(box, initiator):
    initiator.offer(T1, {1: ("sdb", "blocked")}, state="FAILED")
    box.hook("sys_mount_point", "/mnt/VV/share1", ret=1)
    load(box, {1: (T1, {"luns": LUN1})})
    assert state(box, 1) == ["0", "Disconnected", "0"]
    assert len([call for call in box.shell() if "-m session -P 3 " in call]) == 300
