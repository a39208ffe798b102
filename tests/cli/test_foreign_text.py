"""Text from outside (options, a settings file, remote machines) reaches a shell only as text."""

import pathlib
import re

import pytest
from appliance import Site
from harness import messages
from harness.world import COMMANDS

TARGET = "iqn.t1"
# What a shell would run, take apart or take for an option, and what would end the quotes around it.
HOSTILE = [
    "x;touch /f\ntouch /f\n", "$(touch /f)`touch /f`", '";touch /f;"', "';touch /f;'>/f", "-x /f",
    "\x01\x7f*?{x,touch /f}~#!üm\\",
]
PRINTABLE = "".join(map(chr, range(ord(" "), 127))) + ";touch /f"
COMMANDS_OF_THE_TOOL = [name for name in re.findall(r'^    \{"(\w+)"', pathlib.Path(
    __file__).parents[2].joinpath("src/frontend/commands.cpp").read_text("utf-8"), re.M) if name != "help"]
QUOTED = ("target", "user", "secret", "share", "mnt", "-n", "-U", "-P")  # a share of the command line is stored first
ENDS_THE_TREE = ("system_off", "deinit")
SETTINGS = {
    "target": "/iscsi/initiator/id:1/target", "ip": "/iscsi/initiator/id:1/ip",
    "user": "/iscsi/initiator/id:1/chap_name", "secret": "/iscsi/initiator/id:1/chap_pwd",
    "share": "/iscsi/initiator/id:1/lun/id:1/share", "dev": "/iscsi/initiator/id:1/lun/id:1/dev",
    "mnt_dev": "/iscsi/initiator/id:1/lun/id:1/mnt_dev", "mnt": "/iscsi/initiator/id:1/lun/id:1/mnt",
    "prefix": "/iscsi/initiator/prefix",
}


@pytest.fixture
def site(box):
    site = Site(box)
    for command in ("killall", "rmmod", "insmod", "iscsid", "ping", "dd", "mke2fs", "resize2fs", "umount"):
        box.default(command)
    box.default("iscsiadm", "-m discovery", status=7)
    site.offer(TARGET, {0: "sdb"})
    site.disk("sdb")
    for name in ("sys_get_disk_space", "sys_get_partition_list", "sys_check_dev", "sys_get_fs_type",
                 "sys_check_fs_state", "sys_get_partition_size", "sys_mount_point", "sys_get_df_info",
                 "sys_create_1_partition", "LIB_Get_Lan_Link_Speed"):
        box.hook(name, ret=1)
    return site


def store(site):
    site.store(TARGET, luns=[("vol", 0, {"dev": "sdb", "mnt_dev": "/dev/sdb1", "mnt": "/mnt/VV/vol"})], chap=1,
               chap_name="user", chap_pwd="secret", conn_set=1, conn_state=3)


def check_calls(box, value):
    """The value is one argument, or a part of one, or it is not there at all."""
    for words in (run for command in COMMANDS for run in box.runs(command)):
        for word in words:
            assert not any(piece in word for piece in ("touch", "/f")) or value in word, (value, words)
    assert not box.path("/f").exists(), value


@pytest.mark.parametrize("key", SETTINGS)
def test_no_setting_runs_a_command(site, box, key):
    for value in HOSTILE:
        box.forget()
        store(site)
        box.tree.set(SETTINGS[key], value)
        name = value if key == "target" else TARGET
        for command in (["--disconnect"], ["--init"], ["--connect", "-n", name], ["--format", "-n", name, "-l", "0"],
                        ["--oiscsi_evt_recover", "-n", name], ["--modify", "-n", name, "-c", "1", "-U", "u", "-P", "p"],
                        ["--del", "-n", name]):
            box.remvol(*command)
        check_calls(box, value)


@pytest.mark.parametrize("option", "nsiplcUPow")
def test_no_option_runs_a_command(site, box, option):
    for value in HOSTILE:
        box.forget()
        options = {"-n": "iqn.t2", "-i": "10.0.0.2", "-p": "3260", "-l": "1", "-s": "s", "-c": "1", "-U": "u", "-P": "p",
                   "-o": "/tmp/o", "-w": "1", f"-{option}": value}
        words = [word for pair in options.items() for word in pair]
        for command in ("add", "connect", "search", "search_lun", "modify", "modify_address", "oiscsi_evt_recover", "del"):
            box.remvol(f"--{command}", *words)
        box.wait_quiet()
        check_calls(box, value)


@pytest.mark.parametrize("given", [*SETTINGS, *(f"-{letter}" for letter in "nsiUPo")])
def test_no_printable_character_gets_out_of_any_command(site, box, given):
    options = {"-n": TARGET, "-i": "10.0.0.2", "-p": "3260", "-l": "0", "-s": "s", "-c": "1", "-U": "u", "-P": "p",
               "-o": "/tmp/o", "-w": "1"}
    options.update({given: PRINTABLE} if given in options else {"-n": PRINTABLE} if given == "target" else {})
    words = [word for pair in options.items() for word in pair]
    assert len(COMMANDS_OF_THE_TOOL) == 18
    for command in sorted(COMMANDS_OF_THE_TOOL, key=lambda name: name in ENDS_THE_TREE):
        if command in ENDS_THE_TREE[1:]:
            box.tree.start()
        store(site)
        if given in SETTINGS:
            box.tree.set(SETTINGS[given], PRINTABLE)
        box.remvol(f"--{command}", *words)
    box.wait_quiet()
    check_calls(box, PRINTABLE)
    # A shell that takes it apart may find no command in it.
    arrived = any(PRINTABLE in word for command in COMMANDS for words in box.runs(command) for word in words)
    assert arrived == (given in QUOTED)


@pytest.mark.parametrize("secret", ["a$b", '"quoted"', "back`tick`", "back\\slash", "$(x)", "a'b", "a b ", "!#~*?", "ümläut"])
def test_a_secret_arrives_as_it_was_typed(site, box, secret):
    box.remvol("--add", "-n", TARGET, "-l", "0", "-i", "10.0.0.1", "-p", "3260", "-s", "s", "-c", "1", "-U", f"u{secret}",
               "-P", secret)
    values = {run[run.index("-n") + 1]: run[-1] for run in box.runs("iscsiadm") if "-v" in run}
    assert values["node.session.auth.username"] == f"u{secret}"
    assert values["node.session.auth.password"] == secret


@pytest.mark.parametrize("option", ["-U", "-P"])
def test_a_credential_of_two_lines_is_not_stored(site, box, option):
    words = {"-U": "u", "-P": "p", option: "x\nnode.startup = automatic"}
    done = box.remvol("--add", "-n", TARGET, "-l", "0", "-i", "10.0.0.1", "-p", "3260", "-s", "s", "-c", "1",
                      *[word for pair in words.items() for word in pair])
    assert not any("automatic" in word for run in box.runs("iscsiadm") for word in run)
    assert "cmd of iscsiadm is refused, a setting is of more than one line" in messages(done)


@pytest.mark.parametrize("name", ["x;y", "-x", "a b", "../../x"])
def test_a_refused_name_is_a_failed_command(site, box, name):
    site.store(name)
    done = box.remvol("--connect", "-n", name)
    assert done.status == 255
    assert box.tree.get("/iscsi/initiator/id:1/conn_state") == "4"
    assert not any("-o" in run for run in box.runs("iscsiadm"))
    assert any("is refused" in text for text in messages(done))


def test_a_stored_node_that_is_no_node_is_passed_over(site, box):
    store(site)
    site.tree.set(SETTINGS["mnt_dev"], "/dev/sdb1 /dev/sda1")
    done = box.remvol("--disconnect", "-n", TARGET)
    assert done.status == 0
    assert not any("/dev/sda1" in word for run in box.runs("fuser") for word in run)
    assert "cmd 'fuser -mk' is refused, a value in it is no plain text" in messages(done)


@pytest.mark.parametrize("prefix", ["a'b", "iqn.x\\nInitiatorAlias=y", "a\nb"])
def test_a_prefix_that_breaks_its_line_is_not_written(site, box, prefix):
    site.tree.set(SETTINGS["prefix"], prefix)
    box.write("/etc/iscsi/initiatorname.iscsi", "InitiatorName=old\n")
    box.remvol("--init")
    box.wait_quiet()
    assert box.path("/etc/iscsi/initiatorname.iscsi").read_text() == "InitiatorName=old\n"
