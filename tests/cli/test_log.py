"""The diagnostic log: levels, prefix, flushing."""

import re
import signal

import pytest

from harness import log_lines, messages
from harness.initiator import store


def texts_of_an_upgrade(box):
    return messages(box.remvol("--verupgrade"))


LEVEL_1 = "Start remvol settings upgrade"
LEVEL_2 = "preious version = 1, now version = 1"


class TestLevel:
    @pytest.fixture(autouse=True)
    def current_settings(self, box):
        box.tree.set("/iscsi/initiator/ver", "1")

    @pytest.mark.parametrize("value,level", [("0", 0), ("1", 1), ("2", 2), ("9", 9), ("1x", 1), (" 2", 2), ("x", 0),
                                             ("-1", -1), ("", 0)])
    def test_a_message_shows_from_its_level_on(self, box, value, level):
        box.tree.set("/iscsi/initiator/dbg", value)
        texts = texts_of_an_upgrade(box)
        assert (LEVEL_1 in texts) == (level >= 1)
        assert (LEVEL_2 in texts) == (level >= 2)

    def test_without_a_key_errors_alone_show(self, box):
        box.hook("getaddrinfo", "nobody", ret=-2)
        done = box.remvol("--search", "-i", "nobody")
        assert messages(done) == ["ip address nobody -> error"]

    def test_a_negative_level_silences_errors(self, box):
        box.debug(-1)
        box.hook("getaddrinfo", "nobody", ret=-2)
        done = box.remvol("--search", "-i", "nobody")
        assert done.stdout == "\nexecute failed.\n"

    def test_the_level_is_read_once(self, box):
        box.hook("ktreec_set", "/result/verupgrade", through=True,
                 effect="ktreec -S /var/run/ktree_sock_vv -s /iscsi/initiator/dbg 9")
        assert texts_of_an_upgrade(box) == []

    def test_the_reading_itself_never_shows(self, box):
        box.debug(9)
        assert not [text for text in texts_of_an_upgrade(box) if "get debug level" in text]

    def test_a_level_that_cannot_be_read_is_0(self, box):
        box.debug(9)
        box.hook("ktreec_get_wb", "/iscsi/initiator/dbg", ret=-1, out="9")
        assert texts_of_an_upgrade(box) == []


class TestLine:
    def test_it_names_file_function_and_line(self, box):
        box.debug(1)
        done = box.remvol("--verupgrade")
        logged = log_lines(done.stdout)
        assert ("src.cpp", "main", "arg[1]: '--verupgrade'") in logged
        assert ("remvol_ver_upgrade.cpp", "version_upgrade", LEVEL_1) in logged
        assert re.search(r"^\(src\.cpp:main:[1-9][0-9]*\): arg\[0\]: 'remvol'$", done.stdout, re.M)

    def test_lines_stand_in_order_with_the_output_of_commands(self, box):
        box.debug(1)
        box.fake("winshare_reload", stdout="reloading\n")
        done = box.remvol("--search")
        assert done.lines[-3:] == [done.lines[-3], "reloading", "execute failed."]
        assert messages(done.lines[-3]) == ["OPT_FLAG: 00000000"]

    def test_output_survives_a_crash_behind_a_hidden_message(self, box):
        box.hook("getaddrinfo", "10.0.0.1", kill=signal.SIGKILL)
        done = box.remvol("--search", "-n", "hidden message", "-i", "10.0.0.1")
        assert (done.status, done.stdout) == (-signal.SIGKILL, "\n")


# Runs a program as a unit does: its output is a stream to the journal. Prints what the journal gets.
IN_A_UNIT = """
import os, socket, subprocess, sys
os.makedirs("/run/systemd/journal", exist_ok=True)
journal = socket.socket(socket.AF_UNIX)
journal.bind("/run/systemd/journal/stdout")
journal.listen()
stream = socket.socket(socket.AF_UNIX)
stream.connect("/run/systemd/journal/stdout")
subprocess.run(sys.argv[1:], stdout=stream, stderr=stream, check=False)
stream.close()
with journal.accept()[0].makefile() as lines:
    print(lines.read(), end="")
"""


def in_a_unit(box, *argv):
    """(priority, text) of each line; the priority is None where the line has none of its own."""
    done = box.run(["/usr/bin/python3", "-c", IN_A_UNIT, *argv])
    found = [re.fullmatch(r"(?:<(\d)>)?(.*)", line).groups() for line in done.stdout.split("\n") if line]
    return [(priority and int(priority), re.sub(r"^\(\S+\.cpp:\w+:\d+\): ", "", text)) for priority, text in found]


class TestJournal:
    def test_failures_are_warnings_and_a_failed_command_is_an_error(self, box):
        box.hook("getaddrinfo", "nobody", ret=-2)
        assert in_a_unit(box, "remvol", "--search", "-i", "nobody") == [
            (4, "ip address nobody -> error"), (3, "execute failed.")]

    @pytest.mark.parametrize("options, text", [
        (["--verupgrade"], "remvol: Do not support settings downgrade to version 1"),
        (["--modify_address", "-n", "iqn.t1", "-i", "10.9.0.2", "-p", "3260"], "Target iqn.t1 is not existed in config"),
    ])
    def test_a_text_without_a_newline_of_its_own_is_a_line(self, box, options, text):
        box.tree.set("/iscsi/initiator/ver", "2")
        assert in_a_unit(box, "remvol", *options) == [(4, text), (3, "execute failed.")]

    def test_flow_and_detail_are_none(self, box):
        box.debug(2)
        box.path("/etc/NAS_CFG").mkdir()
        box.tree.set("/iscsi/initiator/ver", "1")
        lines = in_a_unit(box, "remvol", "--verupgrade")
        assert (6, LEVEL_1) in lines and (7, LEVEL_2) in lines
        assert not [line for line in lines if line[0] is None or line[0] < 6]

    def test_what_is_no_failure_of_the_tool_is_a_note(self, box):
        box.fake("killall", "-q -SIGTERM iscsid", status=1)
        box.unscripted_ok()
        box.run(["touch", "/var/run/ktree_sock_vv_config.pid"])
        lines = in_a_unit(box, "remvol", "--init")
        assert (6, "system() of cmd 'killall -q -SIGTERM iscsid' failed") in lines
        assert (4, "system() of cmd 'insmod /usr/local/modules/driver/libiscsi.ko' failed") in lines

    def test_every_line_of_a_message_has_the_priority(self, box):
        store(box, "iqn.t1", ip="10.9.0.2")
        box.unscripted_ok()
        lines = in_a_unit(box, "remvol", "--connect", "-n", "iqn.t1")
        at = lines.index((4, "Can not find target iqn.t1 in session"))
        assert lines[at + 1] == (4, ", connect failed.")

    def test_the_shell_says_nothing_of_the_signal_that_it_does_not_know(self, box):
        box.run(["ln", "-sf", "dash", "/usr/bin/sh"])
        box.default("killall")
        box.default("iscsiadm")
        assert [line for line in in_a_unit(box, "remvol", "--system_off") if "kill" in line[1]] == []

    def test_programs_of_the_platform(self, box):
        box.write("/etc/NAS_CFG/vv.xml", "damaged")
        box.tree.stop()
        lines = in_a_unit(box, "timeout", "2", "ktree", "-n", "config", "-s", "/run/other", "-l", "/etc/NAS_CFG/vv.xml",
                          "-l", "/usr/local/config/vv.xml")
        assert [priority for priority, text in lines if text.startswith("ktree: ")] == [4, 5]


def test_without_an_output_no_line_goes_into_another_file(box):
    box.tree.set("/iscsi/initiator/dbg", "3")
    assert box.run(["sh", "-c", "exec remvol --check_share_name -s abc >&-"]).status == 0
    texts = [file.read_bytes() for file in box.path("/run/remvol").iterdir() if file.is_file()]
    assert texts and not any(b"share name" in text for text in texts)
