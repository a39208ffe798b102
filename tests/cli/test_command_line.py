"""The command line of remvol: options, the command table, and the paths of success and failure."""

import re
import signal
import subprocess

import pytest

from harness import log_lines, messages
from harness.initiator import store
from harness.ktree_daemon import BUILD

USAGE = (
    "use: {} [\n\t--init\n\t--search -i IP -p port\n"
    "\t--search_lun -n TARGET_NAME -i IP -p port -c CHAP [-U usename -P pwd]\n"
    "\t--add -n TARGET_NAME -l Lun -i IP -p port -s shared -c CHAP [-U usename -P pwd]\n"
    "\t--del -n TARGET_NAME\n\t--del_lun -n TARGET_NAME -l LUN\n\t--format -n TARGET_NAME -l LUN\n"
    "\t--modify -n TARGET_NAME -c CHAP [-U usename -P pwd]\n"
    "\t--modify_address -n TARGET_NAME -i IP -p port\n\t--status\n\t--check_share_name -s shared\n"
    "\t--disconnect [-n TARGET_NAME]\n\t--connect -n TARGET_NAME\n"
    "\t--system_off (for system shutdown use only)\n\t--deinit\n\t--verupgrade\n\r\n"
)

# What stands on the command line for every bit, and the command's needs.
GIVEN = {0x01: ["-n", "iqn.t"], 0x02: ["-c", "0"], 0x04: ["-i", "10.0.0.1"], 0x08: ["-p", "3260"],
         0x20: ["-s", "share"], 0x40: ["-l", "1"]}
NEEDS = {"search": 12, "add": 109, "del": 1, "format": 65, "modify": 3, "check_share_name": 32, "connect": 1,
         "search_lun": 15, "del_lun": 65, "modify_address": 13}


def options_for(bits):
    return [word for bit, words in GIVEN.items() if bits & bit for word in words]


@pytest.mark.unsanitized  # a sanitizer brings its own
class TestTheProgram:
    """It is loaded once for every request."""

    @pytest.mark.native
    def test_it_needs_the_platform_and_the_c_library_alone(self):
        table = subprocess.run(["readelf", "-d", BUILD / "bin/remvol"], capture_output=True, text=True, check=True).stdout
        needed = re.findall(r"NEEDED.*\[(\w+)\.so", table)
        assert sorted(needed) == ["libc", "libktreec", "libostel_common", "libsysaux"]

    @pytest.mark.native
    def test_it_is_small(self, tmp_path):
        subprocess.run(["strip", "-o", tmp_path / "remvol", BUILD / "bin/remvol"], check=True)
        assert (tmp_path / "remvol").stat().st_size <= 150 * 1000


class TestUsage:
    @pytest.mark.parametrize("args", [["-h"], ["--help"], ["--no-such-command"], ["-x"], ["-n"], ["-i"],
                                      ["--status=1"], ["-n", "a", "-h", "-d", "3"]])
    def test_it_is_printed_and_the_run_fails(self, box, args):
        done = box.remvol(*args)
        assert done.stdout == USAGE.format("remvol") + "execute failed.\n"
        assert done.status == 255

    def test_nothing_is_written_without_a_command(self, box):
        box.remvol("-h")
        assert box.trace("set", "del", "dump", "system", "popen") == ["system winshare_reload"]
        assert box.tree.dump() == {}

    def test_it_names_the_program_as_it_was_called(self, box):
        path = f"{box.build}/bin/../bin/remvol"
        assert box.run([path, "-h"]).stdout.startswith(f"use: {path} [\n")

    def test_the_share_service_is_reloaded_between_usage_and_the_last_line(self, box):
        box.fake("winshare_reload", stdout="reloaded\n")
        assert box.remvol("-h").stdout == USAGE.format("remvol") + "reloaded\nexecute failed.\n"

    def test_the_command_named_before_gets_its_result(self, box):
        done = box.remvol("--status", "--help")
        assert done.stdout == "\n" + USAGE.format("remvol") + "execute failed.\n"
        assert box.tree.dump() == {"/result/status": "-1"}


class TestFailurePath:
    def test_it_reloads_smb_alone_then_writes_the_result(self, box):
        done = box.remvol("--add", "-i", "no.such.host.invalid")
        assert done.status == 255
        assert done.lines[-1] == "execute failed."
        assert box.trace("system", "popen", "run", "set", "del", "dump") == [
            "system winshare_reload", "run winshare_reload", "set /result/add=-1"]

    def test_a_failed_reload_and_a_refused_result_change_nothing(self, box):
        box.fake("winshare_reload", status=1)
        box.hook("ktreec_set", "/result/add", ret=-1)
        done = box.remvol("--add", "-h")
        assert (done.status, done.lines[-1]) == (255, "execute failed.")

    def test_it_is_taken_without_the_trees_daemon(self, box):
        box.tree.stop()
        done = box.remvol("--search")
        assert (done.status, done.stdout) == (255, "\nexecute failed.\n")

    def test_a_failure_before_the_command_is_known_writes_nothing(self, box):
        box.remvol("-i", "no.such.host.invalid", "--add")
        assert box.tree.dump() == {}

    def test_a_second_command_is_refused(self, box):
        box.debug(1)
        done = box.remvol("--init", "--status")
        assert "Command parameter check failed, 0 & 6" in messages(done)
        assert "use:" not in done.stdout
        assert done.status == 255
        assert box.tree.get("/result/init") == "-1"
        assert box.tree.get("/result/status") is None

    def test_the_same_command_twice_is_refused(self, box):
        box.debug(1)
        done = box.remvol("--modify_address", "--modify_address")
        assert "Command parameter check failed, 17 & 17" in messages(done)


class TestNoCommand:
    @pytest.mark.parametrize("args", [[], ["-n", "iqn.t"], ["connect"], ["-c", "1", "-w", "3", "--"]])
    def test_it_stops_on_an_assertion(self, box, args):
        done = box.remvol(*args)
        assert done.status == -signal.SIGABRT
        assert "gs_str_command" in done.stderr and "ssertion" in done.stderr
        assert done.stdout == ""
        assert box.trace("set", "del", "dump", "system", "popen") == []


class TestRequiredOptions:
    @pytest.mark.parametrize("command,missing", [(c, bit) for c, need in NEEDS.items() for bit in GIVEN
                                                 if need & bit])
    def test_a_missing_one_takes_the_failure_path(self, box, command, missing):
        box.debug(1)
        given = NEEDS[command] & ~missing
        done = box.remvol(f"--{command}", *options_for(given))
        assert log_lines(done.stdout)[-1] == ("src.cpp", "main", f"OPT_FLAG: {given:08x}")
        assert done.stdout.endswith("execute failed.\n") and "use:" not in done.stdout
        assert done.status == 255
        assert box.trace("set", "dump", "system") == [
            f"set /result/{command}=", "system winshare_reload", f"set /result/{command}=-1"]

    def test_add_without_a_lun_shows_the_whole_flag(self, box):
        box.debug(1)
        done = box.remvol("--add", "-n", "iqn.t", "-i", "10.0.0.1", "-p", "3260", "-s", "share")
        assert messages(done)[-1] == "OPT_FLAG: 0000002d"
        assert box.tree.get("/result/add") == "-1"

    def test_options_that_are_not_asked_for_do_not_stand_in(self, box):
        box.debug(1)
        done = box.remvol("--del", "-c", "1", "-U", "u", "-P", "p", "-o", "/tmp/o", "-w", "1", "-s", "x")
        assert messages(done)[-1] == "OPT_FLAG: 00000022"


class TestOptions:
    def test_each_is_logged_with_its_bit_set(self, box):
        box.debug(1)
        args = ["--del_lun", "-l", "7", "-s", "my share", "-p", "3260", "-i", "10.1.2.3", "-c", "1", "-U", "user",
                "-P", "secret", "-o", "/tmp/out", "-w", "5", "--bad"]
        done = box.remvol(*args)
        logged = log_lines(done.stdout)
        assert {entry[:2] for entry in logged} == {("src.cpp", "main")}
        texts = [entry[2] for entry in logged]
        assert texts[:len(args) + 1] == [
            f"arg[{i}]: '{'***' if a == 'secret' else a}'" for i, a in enumerate(["remvol", *args])]
        assert texts[len(args) + 1:] == [
            "opt('l') with arg '7'", "OPT_FLAG: 00000040",
            "opt('s') with arg 'my share'", "OPT_FLAG: 00000060",
            "opt('p') with arg '3260'", "OPT_FLAG: 00000068",
            "opt('i') with arg '10.1.2.3'", "OPT_FLAG: 0000006c",
            "get ip address 10.1.2.3 = 10.1.2.3, inet_type = AF_INET",
            "opt('c') with arg '1'", "OPT_FLAG: 0000006e",
            "opt('U') with arg 'user'", "OPT_FLAG: 0000006e",
            "opt('P') with arg '***'", "OPT_FLAG: 0000006e"]

    def test_a_name_sets_its_bit(self, box):
        box.debug(1)
        done = box.remvol("--search", "-n", "iqn.t")
        assert messages(done)[-3:] == ["opt('n') with arg 'iqn.t'", "OPT_FLAG: 00000001", "OPT_FLAG: 00000001"]

    @pytest.mark.parametrize("before", [[], ["-c", "0"], ["-c", "2"], ["-c", "x"], ["-c", "1", "-c", "0"]])
    def test_user_and_secret_count_only_behind_chap_1(self, box, before):
        box.debug(1)
        done = box.remvol("--search", *before, "-U", "user", "-P", "secret", "-c", "1")
        assert not [text for text in messages(done) if text.startswith(("opt('U')", "opt('P')"))]

    def test_a_number_may_follow_blanks_and_precede_text(self, box):
        box.debug(1)
        done = box.remvol("--search", "-c", " 1x", "-U", "user")
        assert "opt('U') with arg 'user'" in messages(done)

    def test_every_command_prints_one_line_break(self, box):
        done = box.remvol("-p", "1", "--search")
        assert done.stdout == "\nexecute failed.\n"

    def test_a_command_may_be_shortened(self, box):
        box.remvol("--check")
        assert box.tree.dump() == {"/result/check_share_name": "-1"}

    @pytest.mark.parametrize("short,command", [("--se", "search"), ("--de", "del"), ("--m", "modify"),
                                               ("--oiscsi", "oiscsi_evt_reopen")])
    def test_a_short_form_of_several_means_the_first_of_them(self, box, short, command):
        box.remvol(short, "-h")
        assert box.tree.dump() == {f"/result/{command}": "-1"}

    def test_other_words_are_passed_over(self, box):
        done = box.remvol("search", "--search", "-", "-p", "1", "more")
        assert (done.status, done.stdout) == (255, "\nexecute failed.\n")
        assert box.tree.dump() == {"/result/search": "-1"}


class TestSecret:
    SECRET = "TheSecretOfThisTest"

    @pytest.mark.parametrize("chap", ["1", "0"])
    @pytest.mark.parametrize("form", [["-P", SECRET], [f"-P{SECRET}"]])
    @pytest.mark.native
    def test_it_is_gone_from_the_process_list(self, box, chap, form):
        box.hook("system", "winshare_reload", through=True, effect="cat /proc/$PPID/cmdline >/tmp/cmdline")
        box.remvol("--search", "-c", chap, "-U", "user", *form)
        words = box.path("/tmp/cmdline").read_bytes().split(b"\0")
        assert words[:6] == [b"remvol", b"--search", b"-c", chap.encode(), b"-U", b"user"]
        assert b"Secret" not in b"\0".join(words)

    @pytest.mark.native
    def test_it_is_gone_before_anything_is_waited_for(self, box):
        box.hook("getaddrinfo", "slow", ret=-2, effect="cat /proc/[0-9]*/cmdline >/tmp/cmdline")
        box.remvol("--search", "-i", "slow", "-c", "1", "-P", self.SECRET)
        lines = box.path("/tmp/cmdline").read_bytes()
        assert b"--search" in lines and b"Secret" not in lines

    @pytest.mark.parametrize("level", [0, 1, 2, 3])
    @pytest.mark.parametrize("secret", [SECRET, 'The"$`\\Secret" \\', "x", "\\"])
    @pytest.mark.parametrize("command", [["--add", "-l", "0", "-s", "s"], ["--modify"], ["--search_lun"], ["--connect"]])
    def test_no_message_and_no_temporary_file_shows_it(self, box, level, secret, command):
        box.default("iscsiadm", status=6)
        box.debug(level)
        store(box, "iqn.t", ip="10.0.0.1", chap=1, chap_name="u", chap_pwd=secret)
        words = ["-n", "iqn.t", "-i", "10.0.0.1", "-p", "3260", "-c", "1", "-U", "u", "-P", secret, f"-P{secret}"]
        done = box.remvol(*command, *words)
        shown = done.stdout + done.stderr
        stored = re.findall("auth.password -v (.*)' failed", shown)
        assert all(text == '"***"' for text in stored)
        if level > 0:
            assert "'***'\n" in shown and "'-P***'\n" in shown
        if "Secret" in secret:
            files = [path.read_bytes() for path in box.path("/tmp").rglob("*") if path.is_file()]
            assert "Secret" not in shown and not any(b"Secret" in text for text in files)

    def test_no_core_shows_it(self, box):
        """It is killed while one of its commands runs: that one's shell is the child of the tool. The signal is one
        that the sanitizers leave alone."""
        box.hook("system", "winshare_reload", through=True, effect="kill -ABRT $PPID")
        box.write("/run-it", f'ulimit -c unlimited; cd /tmp; exec remvol --search -c 1 -U u -P {self.SECRET}\n')
        assert box.run(["sh", "/run-it"]).status == -6
        assert not list(box.path("/tmp").glob("core*"))

    def test_a_program_that_it_starts_may_leave_a_core(self, box):
        effect = "ulimit -c unlimited; cd /tmp; sh -c 'kill -ABRT $$'"
        box.hook("system", "winshare_reload", through=True, effect=effect)
        box.remvol("--search")
        if box.path("/proc/sys/kernel/core_pattern").read_text().strip() == "core":
            assert list(box.path("/tmp").glob("core*"))


class TestAddress:
    @pytest.mark.parametrize("given,ip,family", [
        ("10.0.0.1", "10.0.0.1", "AF_INET"),
        ("::1", "[::1]", "AF_INET6"),
        ("fe80:0:0::1", "[fe80::1]", "AF_INET6"),
        ("2001:db8:1111:2222:3333:4444:5555:6666", "[2001:db8:1111:2222:3333:4444:5555:6666]", "AF_INET6"),
        ("10.1", "10.0.0.1", "AF_INET"),
    ])
    def test_a_number_is_normalised(self, box, given, ip, family):
        box.debug(1)
        done = box.remvol("--search", "-i", given)
        assert f"get ip address {given} = {ip}, inet_type = {family}" in messages(done)

    def test_a_name_is_resolved_by_the_system(self, box):
        box.debug(1)
        box.write("/etc/hosts", "10.9.8.7 portal\n")
        done = box.remvol("--search", "-i", "portal")
        assert "get ip address portal = 10.9.8.7, inet_type = AF_INET" in messages(done)

    @pytest.mark.parametrize("answer,ip,family", [("10.0.0.2 fe80::1", "10.0.0.2", "AF_INET"),
                                                  ("fe80::2 10.0.0.1", "[fe80::2]", "AF_INET6")])
    def test_the_first_answer_is_taken(self, box, answer, ip, family):
        box.debug(1)
        box.hook("getaddrinfo", "portal", out=answer)
        done = box.remvol("--search", "-i", "portal")
        assert f"get ip address portal = {ip}, inet_type = {family}" in messages(done)
        assert box.calls[-1].kind != "getaddrinfo"
        [asked] = [call.fields for call in box.calls if call.kind == "getaddrinfo"]
        assert asked == ["portal", "flags=0 family=0 type=1 protocol=0 service=none"]

    def test_the_last_of_several_addresses_counts(self, box):
        box.debug(1)
        done = box.remvol("--search", "-i", "10.0.0.1", "-i", "::1")
        assert messages(done)[-2] == "get ip address ::1 = [::1], inet_type = AF_INET6"

    def test_one_that_does_not_resolve_fails(self, box):
        box.debug(1)
        box.hook("getaddrinfo", "nobody", ret=-2)
        done = box.remvol("--search", "-i", "nobody", "-p", "1")
        assert log_lines(done.stdout)[-2:] == [
            ("src.cpp", "_resovle_net_address_to_ip", "getaddrinfo return Name or service not known"),
            ("src.cpp", "main", "ip address nobody -> error")]
        assert "known\n\n(src.cpp:main" in done.stdout
        assert (done.status, box.tree.get("/result/search")) == (255, "-1")

    def test_an_empty_one_is_not_asked_for(self, box):
        done = box.remvol("--search", "-i", "")
        assert messages(done) == ["ip address  -> error"]
        assert box.trace("getaddrinfo") == []

    def test_one_of_another_family_fails(self, box):
        box.debug(1)
        box.hook("getaddrinfo", "odd", out="unix")
        done = box.remvol("--search", "-i", "odd")
        assert log_lines(done.stdout)[-2] == ("src.cpp", "_resovle_net_address_to_ip", "get ip address failed")
        assert "get ip address failed\n\n" in done.stdout
        assert done.status == 255

    def test_ipv4_that_cannot_be_written_is_empty_and_goes_on(self, box):
        box.debug(1)
        box.hook("inet_ntop", "AF_INET", ret=0, errno=28)
        done = box.remvol("--search", "-i", "10.0.0.1")
        assert log_lines(done.stdout)[-3] == ("src.cpp", "_resovle_net_address_to_ip", "inet_ntop failed")
        assert messages(done)[-2:] == ["get ip address 10.0.0.1 = , inet_type = AF_INET", "OPT_FLAG: 00000004"]

    def test_ipv6_that_cannot_be_written_fails(self, box):
        box.debug(1)
        box.hook("inet_ntop", "AF_INET6", ret=0, errno=28)
        done = box.remvol("--search", "-i", "::1")
        assert "OPT_FLAG: 00000004\nget address failed\n(src.cpp:_resovle_net_address_to_ip:" in done.stdout
        assert messages(done)[-2:] == ["inet_ntop failed", "ip address ::1 -> error"]
        assert done.status == 255


class TestDebugLevelOption:
    @pytest.mark.parametrize("given,stored", [("2", "2"), ("-1", "-1"), ("x", "0"), ("3x", "3"), ("", "0")])
    def test_it_is_stored_and_the_run_ends(self, box, given, stored):
        done = box.remvol("-d", given, "--status")
        assert log_lines(done.stdout) == [("src.cpp", "main", f"ktreec_set /iscsi/initiator/dbg={stored}")]
        assert done.stdout.count("\n") == 1
        assert done.status == 0
        assert box.tree.dump() == {"/iscsi/initiator/dbg": stored}
        assert box.trace("set", "dump", "system") == [f"set /iscsi/initiator/dbg={stored}"]

    def test_a_command_before_it_does_not_run_either(self, box):
        done = box.remvol("--status", "-d", "1")
        assert (done.status, done.stdout[0]) == (0, "\n")
        assert box.tree.dump() == {"/iscsi/initiator/dbg": "1"}

    def test_a_refused_write_is_told_and_ends_well(self, box):
        box.hook("ktreec_set", "/iscsi/initiator/dbg", ret=-1)
        done = box.remvol("-d", "1")
        assert log_lines(done.stdout) == [("src.cpp", "main", "ktreec_set /iscsi/initiator/dbg=1"),
                                         ("src.cpp", "main", "ktreec_set(/iscsi/initiator/dbg) failed ")]
        assert done.status == 0


class TestVersionOption:
    def test_it_is_printed_and_the_run_ends(self, box):
        done = box.remvol("--status", "-v", "-h")
        assert (done.status, done.stdout) == (0, "\n\n\rremvol version: 1\n\r")
        assert box.trace("set", "dump", "system") == []


class TestSuccessPath:
    """Of a command that changes nothing outside, and of one that does."""

    def test_result_then_dump(self, box):
        box.path("/etc/NAS_CFG").mkdir()
        done = box.remvol("--verupgrade")
        assert (done.status, done.stdout) == (0, "\n")
        assert box.trace("set", "del", "dump", "system", "run") == [
            "set /result/verupgrade=", "set /iscsi/initiator/ver=1", "del /iscsi/initiator/fwupgrade",
            "set /result/verupgrade=0", "dump /etc/NAS_CFG/vv.xml"]
        assert box.tree.get("/result/verupgrade") == "0"
        assert "<verupgrade>0</verupgrade>" in box.path("/etc/NAS_CFG/vv.xml").read_text()

    def test_refused_result_and_dump_are_passed_over(self, box):
        box.hook("ktreec_set", "/result/verupgrade", ret=-1)
        box.hook("ktreec_dump", ret=-1)
        assert box.remvol("--verupgrade").status == 0

    def test_a_failed_handler_says_so_at_level_1(self, box):
        box.tree.set({"/iscsi/initiator/ver": "2", "/iscsi/initiator/dbg": "1"})
        done = box.remvol("--verupgrade")
        assert log_lines(done.stdout)[-1] == ("src.cpp", "main", "task_version_upgrade() failed")
        assert (done.status, box.tree.get("/result/verupgrade")) == (255, "-1")
        assert box.trace("dump", "system") == ["system winshare_reload"]


SHARES = "system winshare_reload ; macshare_reload"
FLASH = 'system flashrun "cp -f /etc/NAS_CFG/vv.xml /usr/local/config/"'


def done_by_main(box, command):
    """What happens from the final result on."""
    trace = box.trace("set", "dump", "system")
    return trace[trace.index(f"set /result/{command}=0"):]


class TestSuccessOfChangingCommands:
    """--disconnect without targets logs out of everything, which here works."""

    @pytest.fixture(autouse=True)
    def initiator(self, box):
        box.fake("iscsiadm")

    def test_settings_go_to_flash_and_shares_are_reloaded(self, box):
        assert box.remvol("--disconnect").status == 0
        assert done_by_main(box, "disconnect") == [
            "set /result/disconnect=0", "dump /etc/NAS_CFG/vv.xml", FLASH, SHARES]
        assert box.runs("flashrun") == [["cp -f /etc/NAS_CFG/vv.xml /usr/local/config/"]]

    def test_a_reset_to_defaults_keeps_the_flash_as_it_is(self, box):
        box.write("/tmp/reset_default", "")
        assert box.remvol("--disconnect").status == 0
        assert done_by_main(box, "disconnect") == [
            "set /result/disconnect=0", "dump /etc/NAS_CFG/vv.xml", SHARES]

    def test_failing_helpers_do_not_matter(self, box):
        box.fake("flashrun", status=1, first=True)
        box.fake("winshare_reload", status=1, first=True)
        box.fake("macshare_reload", status=1, first=True)
        box.hook("ktreec_dump", ret=-1)
        done = box.remvol("--disconnect")
        assert (done.status, box.tree.get("/result/disconnect")) == (0, "0")
        assert done_by_main(box, "disconnect")[1:] == ["dump /etc/NAS_CFG/vv.xml", FLASH, SHARES]

    def test_a_tree_that_was_not_there_before_is_not_missed(self, box):
        box.tree.stop()
        done = box.remvol("--disconnect")
        assert done.status == 0, done.stdout

    def test_the_result_is_empty_while_the_handler_runs(self, box):
        box.tree.set("/result/disconnect", "-1")
        box.fake("iscsiadm", first=True, effect="ktreec -S /var/run/ktree_sock_vv -g /result/disconnect >/tmp/seen")
        box.remvol("--disconnect")
        assert box.path("/tmp/seen").read_text() == "\n"
        assert box.tree.get("/result/disconnect") == "0"

    def test_an_empty_result_that_is_refused_does_not_stop_the_handler(self, box):
        box.hook("ktreec_set", "/result/disconnect", value="", ret=-1)
        assert box.remvol("--disconnect").status == 0
        assert box.tree.get("/result/disconnect") == "0"

    @pytest.mark.parametrize("command,args", [
        ("add", []), ("del", []), ("del_lun", []), ("format", []), ("modify", []), ("connect", []),
        ("disconnect", ["-n", "iqn.t"]), ("modify_address", [])])
    def test_a_command_that_failed_changes_no_settings(self, box, command, args):
        box.debug(1)
        box.tree.set("/iscsi/initiator/id:1/target", "")
        box.hook("ktreec_set", re.compile("^/iscsi/"), ret=-1)
        given = args or options_for(NEEDS[command])
        done = box.remvol(f"--{command}", *given)
        assert done.status == 255
        assert box.trace("dump") == []
        assert FLASH not in box.trace("system")
        text = {"modify_address": "task_modify() failed"}.get(command, f"task_{command}() failed")
        assert log_lines(done.stdout)[-1] == ("src.cpp", "main", text)
        assert box.trace("set", "system")[-2:] == ["system winshare_reload", f"set /result/{command}=-1"]

    def test_a_failed_logout_of_everything_has_its_own_message(self, box):
        box.debug(1)
        box.fake("iscsiadm", status=21, first=True)
        done = box.remvol("--disconnect")
        assert log_lines(done.stdout)[-1] == ("src.cpp", "main", "task_disconnect(all) failed")
        assert done.status == 255


class TestFailureOfOtherCommands:
    """Those that change no settings: each has its message, some that of another command."""

    @pytest.mark.parametrize("command,args,text", [
        ("search", ["-i", "10.0.0.1", "-p", "0"], "task_search() failed"),
        ("search_lun", ["-n", "", "-c", "0", "-i", "10.0.0.1", "-p", "3260"], "task_search_lun() failed"),
        ("system_off", [], "system_off failed"),
        ("deinit", [], "task_deinit failed"),
        ("oiscsi_evt_reopen", [], "task_oiscsi_evt_reopen failed"),
        ("oiscsi_evt_recover", [], "task_oiscsi_evt_reopen failed"),
    ])
    def test_it_is_told_and_nothing_is_dumped(self, box, command, args, text):
        box.debug(1)
        for tool in ("iscsiadm", "killall", "rmmod"):
            box.fake(tool, status=1)
        done = box.remvol(f"--{command}", *args)
        assert log_lines(done.stdout)[-1] == ("src.cpp", "main", text)
        assert (done.status, done.lines[-1]) == (255, "execute failed.")
        assert box.trace("dump") == []
        assert box.trace("set", "system")[-2:] == ["system winshare_reload", f"set /result/{command}=-1"]


class TestSuccessOfOtherCommands:
    @pytest.mark.parametrize("command", ["init", "system_off", "deinit"])
    def test_starting_and_stopping_copies_nothing(self, box, command):
        for tool in ("iscsiadm", "iscsid", "killall", "rmmod", "insmod"):
            box.fake(tool)
        assert box.remvol(f"--{command}").status == 0
        assert done_by_main(box, command) == [f"set /result/{command}=0", "dump /etc/NAS_CFG/vv.xml"]

    def test_status_prints_one_empty_line_first_and_copies_nothing(self, box):
        box.tree.set("/iscsi/initiator/count", "0")
        done = box.remvol("--status")
        assert (done.status, done.stdout[:1]) == (0, "\n")
        assert done_by_main(box, "status") == ["set /result/status=0", "dump /etc/NAS_CFG/vv.xml"]
        assert box.trace("set")[0] == "set /result/status="

    @pytest.mark.parametrize("share,status", [("taken", 1), ("free", 0), ("Taken", 0)])
    def test_check_share_name_gives_its_answer(self, box, share, status):
        store(box, "iqn.t", luns=[("taken", 0)])
        done = box.remvol("--check_share_name", "-s", share)
        assert done.status == status
        assert box.tree.get("/result/check_share_name") == str(status)
        assert box.trace("dump", "system") == ["dump /etc/NAS_CFG/vv.xml"]


class TestFieldSizes:
    """Texts are cut to what their field holds."""

    @pytest.mark.parametrize("length,status", [(126, 0), (127, 1), (128, 255), (5000, 255)])
    def test_a_share_name_holds_127_bytes(self, box, length, status):
        store(box, "iqn.t", luns=[("s" * 127, 0)])
        assert box.remvol("--check_share_name", "-s", "s" * length).status == status

    @pytest.mark.parametrize("option,most", [("n", 255), ("s", 127), ("U", 127), ("P", 127)])
    def test_a_longer_value_is_refused_not_cut(self, box, option, most):
        box.unscripted_ok()
        done = box.remvol("--add", "-c", "1", f"-{option}", "v" * (most + 1))
        assert done.status == 255
        assert messages(done)[-1] == f"Command parameter check failed, -{option} takes at most {most} bytes"
        assert box.tree.dump() == {"/result/add": "-1"}

    @pytest.mark.parametrize("option", ["U", "P"])
    def test_a_longer_credential_that_does_not_count_is_dropped(self, box, option):
        done = box.remvol("--check_share_name", f"-{option}", "v" * 128, "-s", "s")
        assert done.status == 0

    def test_a_target_name_holds_255_bytes_and_chap_texts_127(self, box):
        box.fake("iscsiadm", status=21)
        box.remvol("--add", "-n", "n" * 255, "-l", "0", "-i", "10.0.0.1", "-p", "3260", "-s", "s", "-c", "1",
                   "-U", "u" * 127, "-P", "p" * 127)
        target = "/iscsi/initiator/id:1"
        assert box.tree.get(f"{target}/target") == "n" * 255
        assert box.tree.get(f"{target}/chap_name") == "u" * 127
        assert box.tree.get(f"{target}/chap_pwd") == "p" * 127

    def test_user_and_secret_before_chap_are_not_stored(self, box):
        box.fake("iscsiadm", status=21)
        box.remvol("--add", "-U", "u", "-P", "p", "-n", "iqn.t", "-l", "0", "-i", "::1", "-p", "3260", "-s", "s")
        target = "/iscsi/initiator/id:1"
        assert box.tree.get(f"{target}/ip") == "[::1]"
        assert (box.tree.get(f"{target}/chap_name"), box.tree.get(f"{target}/chap_pwd")) == ("", "")


class TestStrangeValues:
    @pytest.mark.parametrize("option", "nsiUPcplowd")
    @pytest.mark.parametrize("value", ["x" * 100_000, "%s%n%d" * 50, "\x01\n\t\x7f", b"\xff\xfe\x80".decode(
        "utf-8", "surrogateescape"), "", "'; touch /tmp/broken; '", "$(touch /tmp/broken)`touch /tmp/broken`",
        "99999999999999999999", "-99999999999999999999", "--", "-x"])
    def test_no_value_breaks_the_run(self, box, option, value):
        box.debug(3)
        done = box.remvol("--search", "-c", "1", f"-{option}", value)
        assert done.status in (0, 255)
        assert done.stderr == ""
        assert not box.path("/tmp/broken").exists()

    def test_a_program_path_of_any_length_is_survived(self, box):
        name = "/bin/" + "./" * 2000 + "remvol-link"
        box.path("/bin/remvol-link").symlink_to(f"{box.build}/bin/remvol")
        done = box.run([name, "-h"])
        assert done.stdout.startswith("use: /bin/././")
        assert done.status == 255

    def test_every_command_with_every_option_at_its_worst(self, box):
        worst = [word for option in "nscUPlpow" for word in (f"-{option}", "1" * 5000)]
        for command in NEEDS:
            box.remvol(f"--{command}", "-c", "1", *worst, "-h")
        assert set(box.tree.dump().values()) == {"-1"}
