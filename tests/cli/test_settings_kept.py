"""Settings are never lost: a tree that was never loaded, a daemon that died, settings that are damaged."""

import re

import pytest
from test_iscsi_init import START_TREE, appliance, bring_up, init

SAVED, COPY, DAMAGED = "/etc/NAS_CFG/vv.xml", "/usr/local/config/vv.xml", "/etc/NAS_CFG/vv.xml.damaged"
FLASH = f'system flashrun "cp -f {SAVED} /usr/local/config/"'
LOAD_COPY = f"system ktreec -S /var/run/ktree_sock_vv -l {COPY}"
MARK = "/tmp/reset_default"


def settings(prefix, version="<ver>1</ver>"):
    return f"<config>\n <iscsi>\n  <initiator>{version}<prefix>{prefix}</prefix></initiator>\n </iscsi>\n</config>\n"


# Those of version 0 have no version.
OLD = "<config><iscsi><initiator><prefix>precious</prefix><count>0</count></initiator></iscsi></config>"


OLD_TARGET = OLD.replace("<count>0</count>", "<count>1</count><id><target>iqn.t1</target><share>old</share></id>")


def load(box, path):
    assert box.run(["ktreec", "-S", box.tree.socket, "-l", path], env={"LD_PRELOAD": None}, own=True).status == 0


def prefix(box):
    return box.tree.get("/iscsi/initiator/prefix")


# --- a dump over settings that were never loaded ---


def test_a_restarted_tree_is_not_dumped_over_the_settings(box):
    box.tree.set({"/iscsi/initiator/ver": "1", "/iscsi/initiator/prefix": "precious"})
    box.path("/etc/NAS_CFG").mkdir()
    assert box.remvol("--check_share_name", "-s", "x").status == 0
    saved = box.path(SAVED).read_text()
    assert "precious" in saved
    box.tree.restart()
    box.forget()
    done = box.remvol("--check_share_name", "-s", "x")
    assert done.status == 0
    assert f"{SAVED} is kept as it is: the tree was never loaded from it" in done.stdout
    assert box.path(SAVED).read_text() == saved
    assert box.trace("dump") == []
    assert box.tree.get("/result/check_share_name") == "0"


def test_what_was_not_dumped_is_not_copied_to_flash(box):
    box.write(SAVED, settings("precious"))
    box.fake("iscsiadm")
    assert box.remvol("--disconnect").status == 0
    assert box.trace("dump") == [] and FLASH not in box.trace("system")
    assert "system winshare_reload ; macshare_reload" in box.trace("system")


# What a file must hold to count as settings: the version, where it belongs.
VERSIONS = {
    "one line": ('<?xml version="1.0"?><config><iscsi><initiator><ver>1</ver></initiator></iscsi></config>', True),
    "attributes": ('<config a="b"><x/><iscsi\n b="1"><id>t</id><initiator c="d"><id><a/></id><ver z="1">1</ver>', True),
    "torn behind it": ("<config><iscsi><initiator><ver>1", True),
    "long tag": (f'<config><iscsi><initiator><x y="{"z" * 99}"/><ver>1</ver></initiator></iscsi></config>', True),
    "empty": ("", False),
    "no version": ("<config><iscsi><initiator><prefix>p</prefix></initiator></iscsi></config>", False),
    "an empty version": ("<config><iscsi><initiator><ver></ver></initiator></iscsi></config>", False),
    "an empty element": ("<config><iscsi><initiator><ver/></initiator></iscsi></config>", False),
    "elsewhere": ("<config><ver>1</ver><iscsi><ver>1</ver><initiator><id><ver>1</ver></id><vers>1</vers>"
                  "</initiator></iscsi></config>", False),
    "rubbish": ("</a></b><config><iscsi><initiator><ver>1</ver>", False),
}


@pytest.mark.parametrize("saved, copy", [(settings("precious"), None), (None, settings("precious")), ("", settings("precious")),
                                         (OLD, None), (None, OLD)],
                         ids=["saved", "copy", "copy of a torn one", "saved of version 0", "copy of version 0"])
@pytest.mark.parametrize("command", [["--verupgrade"], ["--check_share_name", "-s", "x"]])
def test_no_command_makes_a_tree_that_was_never_loaded_one_that_was(box, saved, copy, command):
    """An upgrade stores a version, which would make the next dump one of the settings."""
    box.path("/etc/NAS_CFG").mkdir()
    for path, text in ((SAVED, saved), (COPY, copy)):
        if text is not None:
            box.write(path, text)
    done = box.remvol(*command)
    assert (done.status, box.trace("dump")) == (0, [])
    assert box.tree.get("/iscsi/initiator/ver") is None
    assert f"{SAVED if saved else COPY} is kept as it is: the tree was never loaded from it" in done.stdout
    assert (box.path(SAVED).read_text() if box.path(SAVED).exists() else None) == saved


@pytest.mark.parametrize("saved, copy", [(OLD, None), (OLD, settings("of today")), (OLD_TARGET, None)])
def test_loaded_settings_of_version_0_are_upgraded_and_saved(box, saved, copy):
    box.write(SAVED, saved)
    load(box, SAVED)
    if copy is not None:
        box.write(COPY, copy)
    assert box.remvol("--verupgrade").status == 0
    assert "<ver>1</ver>" in box.path(SAVED).read_text() and "precious" in box.path(SAVED).read_text()


@pytest.mark.parametrize("command", ["--verupgrade", "--init"])
def test_settings_of_version_0_that_were_loaded_by_hand_take_the_place_of_todays(box, command):
    appliance(box)
    box.write("/root/old.xml", OLD_TARGET)
    load(box, "/root/old.xml")
    box.write(SAVED, settings("of today"))
    assert box.remvol(command).status == 0
    assert box.tree.get("/iscsi/initiator/id:1/lun/id:1/share") == "old"
    assert "<ver>1</ver>" in box.path(SAVED).read_text() and "precious" in box.path(SAVED).read_text()


@pytest.mark.parametrize("text", [settings("precious"), OLD_TARGET], ids=["today", "version 0"])
def test_a_count_does_not_make_an_empty_tree_a_loaded_one(box, text):
    """The next dump of one without the settings would bury them, and the copy would follow."""
    appliance(box)
    box.write(SAVED, text)
    assert box.remvol("--del", "-n", "iqn.gone").status == 255
    assert box.tree.get("/iscsi/initiator/count") == "0"
    init(box)
    assert prefix(box) == "precious"
    assert "precious" in box.path(SAVED).read_text()


def test_a_count_in_an_empty_tree_is_not_saved_over_the_only_copy(box):
    appliance(box)
    box.path("/etc/NAS_CFG").mkdir()
    box.write(COPY, settings("precious"))
    assert box.remvol("--del", "-n", "iqn.gone").status == 255
    box.fake("iscsiadm", first=True, times=1)
    assert box.remvol("--disconnect").status == 0
    assert not box.path(SAVED).exists() and FLASH not in box.trace("system")
    init(box)
    assert prefix(box) == "precious"
    assert "precious" in box.path(SAVED).read_text()


@pytest.mark.parametrize("target", ["vv.xml", "/proc/self/mem"])
def test_settings_that_cannot_be_read_are_not_buried(box, target):
    """The one cannot be opened, of the other no byte can be read."""
    appliance(box)
    box.path("/etc/NAS_CFG").mkdir()
    box.path(SAVED).symlink_to(target)
    assert box.remvol("--verupgrade").status == 0
    init(box)
    assert box.tree.get("/iscsi/initiator/ver") is None
    assert box.path(SAVED).is_symlink()
    box.path(SAVED).unlink()
    box.write(SAVED, settings("readable again"))
    init(box)
    assert prefix(box) == "readable again"


@pytest.mark.parametrize("text, withheld", VERSIONS.values(), ids=VERSIONS)
def test_only_settings_with_a_version_are_kept(box, text, withheld):
    box.write(SAVED, text)
    assert box.remvol("--check_share_name", "-s", "x").status == 0
    assert (box.trace("dump") == []) == withheld
    assert (box.path(SAVED).read_text() == text) == withheld


def test_a_failed_dump_is_told(box):
    box.path("/etc/NAS_CFG").mkdir()
    box.hook("ktreec_dump", ret=-1)
    done = box.remvol("--verupgrade")
    assert done.status == 0
    assert f"ktreec_dump({SAVED}) failed" in done.stdout


def test_settings_that_nobody_made_a_place_for_are_told_beside_the_log(box):
    done = box.remvol("--verupgrade")
    assert (done.status, done.stdout) == (0, "\n")
    assert done.stderr == "remvol: the settings are not saved, there is no /etc/NAS_CFG\n"


@pytest.mark.parametrize("text, copied", [(settings("whole"), True), (settings("whole") + " \r\n\t", True), ("<config><iscsi>", False),
                                          (settings("whole") + "\0\0", False), ("", False)])
def test_after_a_failed_dump_only_a_whole_file_goes_to_flash(box, text, copied):
    box.tree.set("/iscsi/initiator/ver", "1")
    box.write(SAVED, text)
    box.fake("iscsiadm")
    box.hook("ktreec_dump", ret=-1)
    assert box.remvol("--disconnect").status == 0
    assert (FLASH in box.trace("system")) == copied


# --- the flash copy ---


@pytest.mark.parametrize("plant", ["touch", "mkdir", "ln -s /etc/passwd", "mkfifo"])
@pytest.mark.parametrize("owner, copied", [(0, False), (1234, True)])
def test_a_mark_of_any_kind_stops_the_copying_when_it_is_root_s(box, plant, owner, copied):
    box.run(["sh", "-c", f"{plant} {MARK} && chown -h {owner} {MARK}"], env={"LD_PRELOAD": None})
    box.fake("iscsiadm")
    assert box.remvol("--disconnect").status == 0
    assert (FLASH in box.trace("system")) == copied


def test_a_copy_that_fails_changes_neither_result_nor_output(box):
    """The copying command says itself what went wrong."""
    box.fake("iscsiadm")
    expected = box.remvol("--disconnect")
    box.fake("flashrun", status=1, first=True)
    done = box.remvol("--disconnect")
    assert (done.status, done.stdout) == (0, expected.stdout)
    assert box.tree.get("/result/disconnect") == "0"


# --- start-up ---


def test_a_daemon_that_was_killed_is_started_again(box):
    appliance(box)
    box.write(SAVED, settings("saved"))
    assert box.tree.get("/x") is None
    box.tree.daemon.kill(9)
    box.tree.daemon.wait()
    assert box.path("/var/run/ktree_sock_vv_config.pid").exists()
    box.hook("sleep", "1", first=True, times=1, effect="until ktreec -S /var/run/ktree_sock_vv -t >/dev/null 2>&1 || "
             "[ $? -ne 3 ]; do sleep 0.01; done")
    init(box)
    assert box.trace()[: len(START_TREE)] == START_TREE
    assert prefix(box) == "saved"
    assert "saved" in box.path(SAVED).read_text()


def test_a_daemon_that_is_stopped_is_not_started_twice(box):
    """It has the connection taken by the kernel, so it lives."""
    box.tree.set("/a", "1")
    appliance(box)
    box.hook("ktreec_get_wb", "/result/init", ret=-1)
    init(box)
    assert START_TREE[0] not in box.trace()


@pytest.mark.parametrize("saved", [None, "", "<config><iscsi><initi", "<config><a></b></config>"])
def test_settings_that_are_lost_come_from_the_flash(bare_box, saved):
    box = bare_box
    appliance(box)
    box.write(COPY, settings("copy"))
    if saved is not None:
        box.write(SAVED, saved, mode=0o600)
    else:
        box.path("/etc/NAS_CFG").mkdir()
    done = init(box)
    assert box.trace() == START_TREE + [LOAD_COPY] + bring_up("copynas-box:initiator-1b2c3d")
    assert f"{SAVED} is missing or damaged, {COPY} was loaded instead" in done.stdout
    assert "copy" in box.path(SAVED).read_text()
    kept = box.path(DAMAGED)
    assert (kept.read_text() if kept.exists() else None) == saved
    if saved is not None:
        assert kept.stat().st_mode & 0o777 == 0o600


@pytest.mark.parametrize("saved", [settings("saved"), ""])
def test_a_tree_that_a_killed_start_left_empty_is_loaded(box, saved):
    appliance(box)
    box.write(SAVED, saved)
    box.write(COPY, settings("copy"))
    assert box.tree.get("/x") is None
    init(box)
    assert START_TREE[0] not in box.trace()
    assert prefix(box) == ("saved" if saved else "copy")


def test_settings_of_version_0_are_loaded_into_a_tree_that_a_killed_start_left_empty(box):
    appliance(box)
    box.write(SAVED, OLD)
    assert box.tree.get("/x") is None
    init(box)
    assert prefix(box) == "precious"


def test_a_tree_that_cannot_be_read_is_not_loaded_again(box):
    appliance(box)
    box.write(SAVED, settings("saved"))
    box.tree.set({"/iscsi/initiator/ver": "1", "/iscsi/initiator/prefix": "newer"})
    for key in ("ver", "count"):
        box.hook("ktreec_get_wb", f"/iscsi/initiator/{key}", ret=-1)
    init(box)
    assert prefix(box) == "newer"


@pytest.mark.parametrize("source", [SAVED, COPY])
def test_what_was_read_of_the_slots_before_settings_are_loaded_is_believed_no_more(bare_box, source):
    box = bare_box
    appliance(box)
    box.path("/etc/NAS_CFG").mkdir()
    box.write(source, settings("saved"))
    box.hook("system", f"ktreec -S /var/run/ktree_sock_vv -l {source}", through=True, times=1,
             effect="cd /run/remvol && stat -c %s slots.lock >/root/moves && ! flock -n slots.lock true && touch /root/held")
    init(box)
    assert prefix(box) == "saved"
    assert box.path("/root/held").exists()
    assert int(box.path("/root/moves").read_text()) >= 1


@pytest.mark.parametrize("source", [SAVED, COPY])
@pytest.mark.parametrize("status", [-1, 9, 127 << 8])
def test_a_command_that_could_not_load_the_settings_is_run_again(bare_box, source, status):
    """The tree would count as fresh, and be dumped over them."""
    box = bare_box
    appliance(box)
    box.path("/etc/NAS_CFG").mkdir()
    box.write(source, settings("saved"))
    box.hook("system", f"ktreec -S /var/run/ktree_sock_vv -l {source}", ret=status, times=1)
    init(box)
    assert prefix(box) == "saved"
    assert box.trace("system", "sleep").count("sleep 1") >= 1


@pytest.mark.parametrize("source, saved, copy, status", [
    (SAVED, settings("saved"), settings("copy"), 127 << 8),
    (SAVED, settings("saved"), None, 127 << 8),
    (COPY, "<config><precious", settings("copy"), 127 << 8),
], ids=["never runs", "never runs without a copy", "copy never runs"])
def test_settings_that_can_never_be_loaded_are_not_buried(bare_box, source, saved, copy, status):
    """With a version the tree would count as theirs, and be dumped over them and copied to the flash."""
    box = bare_box
    appliance(box)
    box.path("/etc/NAS_CFG").mkdir()
    for path, text in ((SAVED, saved), (COPY, copy)):
        if text is not None:
            box.write(path, text)
    before = box.path(source).read_text()
    box.hook("system", f"ktreec -S /var/run/ktree_sock_vv -l {source}", ret=status)
    done = init(box)
    assert box.trace("sleep").count("sleep 1") == 11
    assert box.tree.get("/iscsi/initiator/ver") is None
    assert box.path(source).read_text() == before
    assert f"{source} is kept as it is: the tree was never loaded from it" in done.stdout
    assert not box.path(DAMAGED).exists() or source == COPY


def test_settings_that_cannot_be_read_are_kept_beside_their_copy(bare_box):
    box = bare_box
    appliance(box)
    box.path("/etc/NAS_CFG").mkdir()
    box.path(SAVED).symlink_to("/proc/self/mem")
    box.write(COPY, settings("copy"))
    init(box)
    assert prefix(box) == "copy"
    assert box.path(DAMAGED).is_symlink()


def test_a_copy_that_cannot_be_read_is_not_buried(bare_box):
    box = bare_box
    appliance(box)
    box.path("/etc/NAS_CFG").mkdir()
    box.path(COPY).parent.mkdir(parents=True, exist_ok=True)
    box.path(COPY).symlink_to("vv.xml")
    init(box)
    assert box.tree.get("/iscsi/initiator/ver") is None
    assert box.path(COPY).is_symlink() and not box.path(SAVED).exists()


@pytest.mark.parametrize("copy", [None, "<config><iscsi>"])
def test_damaged_settings_with_a_version_are_replaced(box, copy):
    """Nobody could save anything any more."""
    appliance(box)
    damaged = settings("old").replace("</prefix>", "</suffix>")
    box.write(SAVED, damaged)
    if copy is not None:
        box.write(COPY, copy)
    assert box.remvol("--del", "-n", "iqn.gone").status == 255
    init(box)
    assert box.tree.get("/iscsi/initiator/ver") == "1"
    assert box.path(DAMAGED).read_text() == damaged
    assert "<ver>1</ver>" in box.path(SAVED).read_text() and "old" not in box.path(SAVED).read_text()


def test_damaged_settings_without_a_copy_are_kept(bare_box):
    box = bare_box
    appliance(box)
    box.write(SAVED, "<config><precious")
    box.write(DAMAGED, "an earlier one")
    init(box)
    assert box.trace() == START_TREE + bring_up()
    assert box.path(DAMAGED).read_text() == "<config><precious"


def test_a_daemon_that_is_slow_to_start_is_waited_for(bare_box):
    """Its tree would count as fresh and be dumped over the settings."""
    box = bare_box
    box.hook("sleep", "1", times=1)
    box.hook("sleep", "1", times=1, effect="until ktreec -S /var/run/ktree_sock_vv -t >/dev/null 2>&1 || [ $? -ne 3 ]; "
             "do sleep 0.01; done")
    appliance(box)
    slow = "sleep 0.5; exec $REAL"
    box.write("/fake/bin/ktree", f"#!/bin/sh\nunset LD_PRELOAD\n{slow}\n".replace("$REAL", f'{box.build}/bin/ktree "$@"'),
              mode=0o755)
    box.write(SAVED, settings("saved"))
    done = init(box)
    assert box.trace("system")[:3] == [START_TREE[0], START_TREE[2], START_TREE[2]]
    assert prefix(box) == "saved"
    assert "saved" in box.path(SAVED).read_text()
    assert re.findall(r"cmd '(ktreec .*)' failed", done.stdout) == [START_TREE[2].removeprefix("system ")]


def test_luns_in_todays_form_are_not_converted_without_a_version(box):
    appliance(box)
    lun = "/iscsi/initiator/id:1/lun/id:"
    values = {"/iscsi/initiator/count": "1", "/iscsi/initiator/id:1/target": "iqn.t1",
              "/iscsi/initiator/id:1/share": "old", "/iscsi/initiator/id:1/lun/count": "2",
              "/iscsi/initiator/id:1/conn_set": "0", lun + "1/lun": "5", lun + "1/share": "five",
              lun + "1/vol_access_right": "0", lun + "2/lun": "7", lun + "2/share": "seven"}
    box.tree.set(values)
    box.default("iscsiadm")
    init(box)
    assert {key: box.tree.get(key) for key in values} == values
    assert box.tree.get("/iscsi/initiator/ver") == "1"
