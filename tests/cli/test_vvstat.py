"""vvstat: the state of targets and volumes for an operator and for programs."""

import fcntl
import json
import os
import pty
import re
import signal
import struct
import termios

import pytest

T1, T2 = "/iscsi/initiator/id:1", "/iscsi/initiator/id:2"
GIB = 1 << 30

EXAMPLE = {
    f"{T1}/target": "iqn.2026-01.org.example:t1", f"{T1}/ip": "10.9.0.2", f"{T1}/port": "3260",
    f"{T1}/chap_pwd": "canary-secret", f"{T1}/chap_name": "user",
    f"{T1}/conn_set": "1", f"{T1}/conn_state": "1", f"{T1}/status": "Connected",
    f"{T1}/lun/id:1/lun": "0", f"{T1}/lun/id:1/share": "Backup", f"{T1}/lun/id:1/enable": "1",
    f"{T1}/lun/id:1/vol_access_right": "1", f"{T1}/lun/id:1/status": "Running",
    f"{T1}/lun/id:1/size": f"{3 * GIB // 2}/{20 * GIB}", f"{T1}/lun/id:1/fs_type": "ext4",
    f"{T1}/lun/id:1/dev": "sdb", f"{T1}/lun/id:1/mnt": "/mnt/VV/Backup", f"{T1}/lun/id:1/format_state": "0",
    f"{T1}/lun/id:1/volume_state": "0",
    f"{T1}/lun/id:2/lun": "1", f"{T1}/lun/id:2/share": "Fotos 日本", f"{T1}/lun/id:2/enable": "1",
    f"{T1}/lun/id:2/status": "Formatting 37%", f"{T1}/lun/id:2/size": "0/0", f"{T1}/lun/id:2/format_state": "1",
    f"{T1}/lun/id:2/format_progress": "37", f"{T1}/lun/id:2/volume_state": "1",
    f"{T2}/target": "iqn.t2", f"{T2}/ip": "[fe80::1]", f"{T2}/port": "3261", f"{T2}/conn_set": "0",
    f"{T2}/conn_state": "0", f"{T2}/status": "Disconnected",
}

TABLE = """\
TARGET / SHARE              PORTAL / LUN    STATUS          USED     SIZE      USE
iqn.2026-01.org.example:t1  10.9.0.2:3260   Connected
  Backup                    LUN 0           Running         1.5 GiB  20.0 GiB  8%
  Fotos 日本                LUN 1           Formatting 37%  -        -         [#######-------------] 37%
iqn.t2                      [fe80::1]:3261  Disconnected
"""


def vvstat(box, *options, **more):
    return box.run(["vvstat", *options], env={"LD_PRELOAD": None}, **more)


@pytest.fixture
def example(box):
    box.tree.set(EXAMPLE)
    return box


def test_the_table(example):
    done = vvstat(example)
    assert (done.status, done.stdout, done.stderr) == (0, TABLE, "")


def test_it_changes_nothing(example):
    before = example.tree.dump()
    vvstat(example)
    vvstat(example, "--json")
    assert example.tree.dump() == before
    assert not example.runs("iscsiadm") and not example.trace("run")


def test_a_tree_without_targets(box):
    done = vvstat(box)
    assert (done.status, done.stdout) == (0, "No targets are configured.\n")
    assert json.loads(vvstat(box, "--json").stdout) == {
        "version": 1, "reachable": True, "all_connected": True, "targets": []}


@pytest.mark.parametrize("wanted, state, status", [("1", "1", 0), ("1", "0", 1), ("1", "2", 1), ("1", "3", 1),
                                                   ("1", "4", 1), ("0", "0", 0), ("0", "4", 0), ("1", "", 1)])
def test_the_exit_status_says_whether_all_is_connected(example, wanted, state, status):
    example.tree.set({f"{T2}/conn_set": wanted, f"{T2}/conn_state": state})
    assert vvstat(example).status == status
    done = vvstat(example, "--json")
    assert done.status == status
    assert json.loads(done.stdout)["all_connected"] == (status == 0)


@pytest.mark.parametrize("wanted, state, text", [("1", "3", "Reconnecting"), ("0", "3", "Disconnected"),
                                                 ("1", "1", "Disconnected"), ("1", "2", "Disconnected")])
def test_a_lost_connection_is_told_although_the_text_in_the_tree_is_older(example, wanted, state, text):
    example.tree.set({f"{T2}/conn_set": wanted, f"{T2}/conn_state": state})
    assert vvstat(example).stdout.splitlines()[-1].endswith("  " + text)
    assert json.loads(vvstat(example, "--json").stdout)["targets"][1]["status"] == text


def test_without_the_tree(box):
    box.tree.stop()
    done = vvstat(box)
    assert (done.status, done.stdout) == (3, "")
    assert done.stderr == "vvstat: the configuration tree cannot be reached\n"
    done = vvstat(box, "--json")
    assert done.status == 3
    assert json.loads(done.stdout) == {"version": 1, "reachable": False, "all_connected": False, "targets": []}


def test_json(example):
    done = vvstat(example, "--json")
    assert done.stdout.count("\n") == 1
    told = json.loads(done.stdout)
    assert told["version"] == 1
    first, second = told["targets"]
    volumes = first.pop("volumes")
    assert first == {"name": "iqn.2026-01.org.example:t1", "address": "10.9.0.2", "port": 3260, "wanted": True,
                     "connected": True, "connect_state": "connected", "status": "Connected"}
    assert volumes[0] == {
        "lun": 0, "share": "Backup", "status": "Running", "enabled": True, "read_only": False, "volume_state": "ready",
        "format_state": "none", "format_progress": 0, "used_bytes": 3 * GIB // 2, "size_bytes": 20 * GIB,
        "file_system": "ext4", "device": "sdb", "mount_point": "/mnt/VV/Backup"}
    assert volumes[1]["share"] == "Fotos 日本"
    assert (volumes[1]["format_state"], volumes[1]["format_progress"]) == ("running", 37)
    assert second["wanted"] is False and second["volumes"] == [] and second["connect_state"] == "disconnected"


@pytest.mark.parametrize("key, name, words", [
    ("format_state", "format_state", {"0": "none", "1": "running", "2": "unknown", "3": "failed", "4": "waiting",
                                      "9": "unknown", "-1": "unknown", "": "unknown"}),
    ("volume_state", "volume_state", {"0": "ready", "1": "creating", "2": "offline", "3": "failed", "4": "unknown",
                                      "5": "unsupported"}),
])
def test_states_in_words(example, key, name, words):
    for number, word in words.items():
        example.tree.set(f"{T1}/lun/id:1/{key}", number)
        told = json.loads(vvstat(example, "-j").stdout)
        assert told["targets"][0]["volumes"][0][name] == word


def test_secrets_are_not_shown(example):
    assert "canary" not in vvstat(example).stdout + vvstat(example, "-j").stdout


@pytest.mark.parametrize("name", ['quo"te', "back\\slash", "new\nline", "\x1b[31mred", "tab\t", "bad\udcff", "\x7f", "é",
                                  "\u0085", "\u2028", "😀"])
def test_names_of_users_break_neither_form(example, name):
    example.tree.set(f"{T1}/lun/id:1/share", name)
    shown = vvstat(example).stdout
    assert shown.count("\n") == 5 and not re.search("[\x00-\x09\x0b-\x1f\x7f-\x9f\u2028]", shown)
    share = json.loads(vvstat(example, "--json").stdout)["targets"][0]["volumes"][0]["share"]
    assert share == name.replace("\udcff", "\\xFF")


@pytest.mark.parametrize("size, shown", [
    ("0/1", "0 B 1 B 0%"), ("1023/1024", "1023 B 1.0 KiB 100%"), ("1024/104857600", "1.0 KiB 100 MiB 0%"),
    ("500/1000", "500 B 1000 B 50%"), ("18446744073709551615/18446744073709551615", "16.0 EiB 16.0 EiB 100%"),
    ("", "- - -"), ("5", "- - -"), ("a/b", "- - -"), ("0/0", "- - -"),
])
def test_sizes(example, size, shown):
    example.tree.set(f"{T1}/lun/id:1/size", size)
    line = vvstat(example).lines[2]
    assert " ".join(line.split("Running")[1].split()) == shown


@pytest.mark.parametrize("progress, bar", [("0", "[--------------------] 0%"), ("4", "[--------------------] 4%"),
                                           ("5", "[#-------------------] 5%"), ("100", "[####################] 100%"),
                                           ("250", "[####################] 100%"), ("-3", "[--------------------] 0%"),
                                           ("", "[--------------------] 0%")])
def test_the_bar(example, progress, bar):
    example.tree.set(f"{T1}/lun/id:2/format_progress", progress)
    assert vvstat(example).lines[3].endswith(" " + bar)


def test_eight_targets_with_eight_volumes(box):
    values = {}
    for target in range(1, 9):
        values[f"/iscsi/initiator/id:{target}/target"] = f"iqn.{target}"
        for lun in range(1, 9):
            values[f"/iscsi/initiator/id:{target}/lun/id:{lun}/lun"] = str(lun)
            values[f"/iscsi/initiator/id:{target}/lun/id:{lun}/share"] = f"s{target}{lun}"
    box.tree.set(values)
    assert len(vvstat(box).lines) == 1 + 8 + 64


@pytest.mark.parametrize("options, status", [(["--help"], 0), (["-h"], 0), (["--version"], 0), (["-V"], 0),
                                             (["--nonsense"], 2), (["more"], 2)])
def test_the_usual_options(bare_box, options, status):
    done = vvstat(bare_box, *options)
    assert done.status == status
    told, silent = (done.stdout, done.stderr) if status == 0 else (done.stderr, done.stdout)
    assert told and not silent


# --- on a terminal ---


class Terminal:
    """vvstat on a terminal of its own."""

    def __init__(self, box, *options, columns=200, lines=50, env=None):
        self.box = box
        self.text = ""
        self.master, slave = pty.openpty()
        fcntl.ioctl(slave, termios.TIOCSWINSZ, struct.pack("HHHH", lines, columns, 0, 0))
        variables = [f"{k}={v}" for k, v in box.env({"LD_PRELOAD": None, **(env or {})}).items()]
        number = next(box.numbers)
        out, err = os.dup(slave), os.memfd_create("err", os.MFD_CLOEXEC)
        from harness.world import Running
        self.running = box.running[number] = Running(box, number, ["vvstat"], os.memfd_create("unused"), err)
        argv = ["vvstat", *options]
        stdin = os.open("/dev/null", os.O_RDONLY)
        box.send(["run", number, "/", len(argv), *argv, *variables], [stdin, out, err])
        for fd in (stdin, out, slave):
            os.close(fd)
        os.set_blocking(self.master, False)

    def read(self):
        try:
            while data := os.read(self.master, 65536):
                self.text += data.decode()
        except OSError:
            pass
        return self.text

    def wait_for(self, text):
        self.box.wait_until(lambda: text in self.read(), what=f"{text!r} in {self.text!r}")

    def end(self):
        result = self.running.wait()
        self.read()
        os.close(self.master)
        return result.status


def test_a_terminal_gets_colour(example):
    terminal = Terminal(example)
    assert terminal.end() == 0
    assert "\x1b[32mConnected\x1b[0m\r\n" in terminal.text
    assert "\x1b[33mFormatting 37%\x1b[0m" in terminal.text
    assert "\x1b[32mRunning\x1b[0m" in terminal.text


def test_a_target_that_should_be_connected_is_marked(example):
    example.tree.set({f"{T1}/conn_state": "4", f"{T1}/status": "Connect Error", f"{T2}/conn_state": "0"})
    terminal = Terminal(example)
    assert terminal.end() == 1
    assert "\x1b[31mConnect Error\x1b[0m" in terminal.text
    assert "  Disconnected\r\n" in terminal.text


def test_no_color_is_respected(example):
    terminal = Terminal(example, env={"NO_COLOR": "1"})
    assert terminal.end() == 0
    assert "\x1b" not in terminal.text


def test_watch_redraws_in_place(example):
    terminal = Terminal(example, "--watch")
    terminal.wait_for("Formatting 37%")
    example.tree.set({f"{T1}/lun/id:2/format_progress": "38", f"{T1}/lun/id:2/status": "Formatting 38%"})
    terminal.wait_for("] 38%")
    terminal.running.kill(signal.SIGINT)
    assert terminal.end() == 0
    begin, end = "\x1b[?1049h\x1b[?25l", "\x1b[?25h\x1b[?1049l"
    assert terminal.text.startswith(begin) and terminal.text.endswith(end)
    frames = terminal.text[len(begin):-len(end)].split("\x1b[H")
    assert frames[0] == "" and len(frames) >= 3
    for frame in frames[1:]:
        lines = frame.split("\r\n")
        assert len(lines) == 6 and lines[5] == "\x1b[J"
        assert all(line.endswith("\x1b[K") for line in lines[:5])


def test_watch_stays_within_a_small_terminal(example):
    terminal = Terminal(example, "--watch", columns=30, lines=4, env={"NO_COLOR": "1"})
    terminal.wait_for("\x1b[J")
    terminal.running.kill(signal.SIGTERM)
    assert terminal.end() == 0
    frame = terminal.text.split("\x1b[H")[1]
    lines = frame.split("\r\n")[:-1]
    assert [line.removesuffix("\x1b[K") for line in lines] == [
        "TARGET / SHARE              PO", "iqn.2026-01.org.example:t1  10", "  Backup                    LU"]


def test_watch_without_targets_stays_within_a_small_terminal(example):
    example.tree.delete("/iscsi")
    terminal = Terminal(example, "--watch", columns=10, lines=4, env={"NO_COLOR": "1"})
    terminal.wait_for("\x1b[J")
    terminal.running.kill(signal.SIGTERM)
    terminal.end()
    assert terminal.text.split("\x1b[H")[1].split("\r\n")[0].removesuffix("\x1b[K") == "No targets"


def test_watch_goes_on_while_the_tree_is_away(example):
    terminal = Terminal(example, "--watch")
    terminal.wait_for("Connected")
    example.tree.stop()
    terminal.wait_for("cannot be reached")
    example.tree.start()
    terminal.wait_for("No targets are configured.")
    example.tree.set({f"{T1}/target": "iqn.x", f"{T1}/conn_set": "1"})
    terminal.wait_for("iqn.x")
    terminal.running.kill(signal.SIGTERM)
    assert terminal.end() == 1


def test_watch_without_a_terminal_is_plain(example):
    running = example.start(["vvstat", "--watch"], env={"LD_PRELOAD": None})
    example.wait_until(lambda: running.stdout.count("TARGET / SHARE") >= 2, what="a second table")
    running.kill(signal.SIGTERM)
    done = running.wait()
    assert done.status == 0 and "\x1b" not in done.stdout


def test_watch_as_json_is_one_object_a_line(example):
    running = example.start(["vvstat", "--watch", "--json"], env={"LD_PRELOAD": None})
    example.wait_until(lambda: running.stdout.count("\n") >= 2, what="a second object")
    running.kill(signal.SIGTERM)
    done = running.wait()
    assert done.status == 0
    assert all(json.loads(line)["version"] == 1 for line in done.lines)


def test_watch_ends_when_nobody_reads(example):
    done = example.run(["sh", "-c", "vvstat --watch | head -n 1"], env={"LD_PRELOAD": None})
    assert done.status == 0
    example.wait_until(lambda: not any("vvstat" in argv[0] for argv in example.processes().values()),
                       what="the end of vvstat")


def test_a_system_without_the_utf8_locale(example):
    done = example.run(["rm", "-rf", "/usr/lib/locale"])
    assert done.status == 0
    done = vvstat(example)
    assert done.status == 0 and "  Fotos 日本 " in done.stdout
    assert json.loads(vvstat(example, "-j").stdout)["targets"][0]["volumes"][1]["share"] == "Fotos 日本"
