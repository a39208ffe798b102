"""The diagnostic log: levels, prefix, flushing."""

import re
import signal

import pytest

from harness import messages, said


def texts_of_an_upgrade(box):
    return said(box.remvol("--verupgrade").stdout)


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
        assert said(done.stdout) == ["ip address nobody -> error"]

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
        logged = messages(done.stdout)
        assert ("src.cpp", "main", "arg[1]: '--verupgrade'") in logged
        assert ("remvol_ver_upgrade.cpp", "version_upgrade", LEVEL_1) in logged
        assert re.search(r"^\(src\.cpp:main:[1-9][0-9]*\): arg\[0\]: 'remvol'$", done.stdout, re.M)

    def test_lines_stand_in_order_with_the_output_of_commands(self, box):
        box.debug(1)
        box.fake("winshare_reload", stdout="reloading\n")
        done = box.remvol("--search")
        assert done.lines[-3:] == [done.lines[-3], "reloading", "execute failed."]
        assert said(done.lines[-3]) == ["OPT_FLAG: 00000000"]

    def test_output_survives_a_crash_behind_a_hidden_message(self, box):
        box.hook("getaddrinfo", "10.0.0.1", kill=signal.SIGKILL)
        done = box.remvol("--search", "-n", "hidden message", "-i", "10.0.0.1")
        assert (done.status, done.stdout) == (-signal.SIGKILL, "\n")
