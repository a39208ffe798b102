"""The harness keeps its promises: what the other tests rely on is shown here once."""

import os
import re
import signal

import pytest

from harness import Box, startswith


@pytest.fixture
def loose_box():
    """A box whose complaints are left to the test."""
    box = Box()
    yield box
    box.close()


def call(box, code, **options):
    """Runs Python in the box; `c` is the C library, with the preloaded one in front."""
    prelude = "import ctypes, os, sys\nc = ctypes.CDLL(None, use_errno=True)\n"
    return box.run(["/usr/bin/python3", "-c", prelude + code], **options)


class TestWorld:
    def test_nothing_done_in_a_box_reaches_the_machine_or_another_box(self, bare_box):
        folders = ["/etc", "/run", "/tmp", "/mnt", "/root", "/usr/local", "/var/lock", "/var/run", "/dev"]
        done = bare_box.run(["touch", *(f"{folder}/left-behind" for folder in folders)])
        assert (done.status, done.stderr) == (0, "")
        other = Box()
        for folder in folders:
            assert bare_box.path(f"{folder}/left-behind").exists()
            assert not os.path.lexists(f"{folder}/left-behind")
            assert not other.path(f"{folder}/left-behind").exists()
        other.close()

    def test_what_the_machine_has_set_up_for_itself_is_not_there(self, bare_box):
        own = ["/etc/iscsi/iscsid.conf", "/etc/samba/smb.conf", "/usr/local/config/vv.xml", "/var/lib/iscsi/nodes/n"]
        for path in own:
            bare_box.write(path, "the machine's own")
        # A box whose machine is this box: its first process answers on its input, and ends when nobody is there.
        code = f"""if 1:
            import os, socket, subprocess
            mine, its = socket.socketpair(socket.AF_UNIX, socket.SOCK_SEQPACKET)
            inner = subprocess.Popen([{str(bare_box.machine_tools / "box")!r}, str(its.fileno())], pass_fds=[its.fileno()])
            its.close()
            print(mine.recv(4096).decode().split()[0], flush=True)
            streams = [os.open("/dev/null", os.O_RDONLY), 1, 2]
            words = ["run", "1", "/", "3", "sh", "-c", "cd /etc; ls -d iscsi samba passwd"]
            socket.send_fds(mine, [b"".join(word.encode() + b"\\0" for word in words)], streams)
            while not mine.recv(4096).startswith(b"ended"):
                pass
            mine.close()
            inner.wait()
        """
        done = bare_box.run(["/usr/bin/python3", "-c", code])
        assert done.lines == ["ready", "passwd"], done.stderr

    def test_a_path_is_followed_inside_the_box(self, bare_box):
        bare_box.write("/etc/iscsi/iscsid.conf", "a = b\n")
        bare_box.run(["ln", "-s", "/etc/iscsi", "/tmp/link"])
        assert bare_box.path("/tmp/link/iscsid.conf").read_text() == "a = b\n"
        assert bare_box.run(["cat", "/etc/iscsi/iscsid.conf"]).stdout == "a = b\n"

    def test_processes_network_and_disks_are_its_own(self, bare_box):
        assert bare_box.run(["sh", "-c", "echo /sys/class/net/*"]).stdout == "/sys/class/net/lo\n"
        assert bare_box.run(["ls", "/sys/block"]).stdout == ""
        assert bare_box.run(["sh", "-c", "echo /proc/[0-9]*"]).stdout.count("/proc/") == 2
        assert bare_box.run(["hostname"]).stdout == "appliance\n"

    def test_input_environment_folder_and_status_reach_the_program(self, bare_box):
        done = bare_box.run(["sh", "-c", 'cat; echo "$X $PWD"; echo no >&2; exit 7'], input="in\n",
                            env={"X": "1"}, cwd="/etc")
        assert (done.status, done.stdout, done.stderr) == (7, "in\n1 /etc\n", "no\n")
        assert bare_box.run(["sh", "-c", "kill -ABRT $$"]).status == -signal.SIGABRT
        assert bare_box.run(["no-such-program"]).status == 127

    def test_a_program_that_hangs_is_killed(self, bare_box):
        with pytest.raises(TimeoutError):
            bare_box.run(["/bin/sleep", "60"], timeout=0.05)
        bare_box.wait_quiet()

    def test_a_long_argument_arrives_whole(self, bare_box):
        assert bare_box.run(["/bin/echo", "x" * 100_000]).stdout == "x" * 100_000 + "\n"

    def test_a_started_program_can_be_watched_and_killed(self, bare_box):
        running = bare_box.start(["sh", "-c", "echo here; exec /bin/sleep 60"])
        bare_box.wait_until(lambda: running.stdout == "here\n")
        assert bare_box.path(f"/proc/{running.pid}").exists()
        running.kill(signal.SIGTERM)
        assert running.wait().status == -signal.SIGTERM

    def test_a_disk_is_a_block_device(self, bare_box):
        backing = bare_box.disk("sdb", 4 << 20, sysfs=True)
        assert bare_box.run(["sh", "-c", "printf abc >/dev/sdb; sync /dev/sdb"]).status == 0
        assert backing.read_bytes()[:3] == b"abc"
        assert bare_box.run(["cat", "/sys/block/sdb/size"]).stdout == f"{(4 << 20) // 512}\n"


class TestFakeCommands:
    def test_a_call_without_an_answer_fails_loudly(self, loose_box):
        loose_box.fake("iscsiadm", "-m session")
        done = loose_box.run(["iscsiadm", "-m", "node"])
        assert done.status == 99
        assert loose_box.complaints() == ["the script has no answer for: iscsiadm -m node"]

    def test_answers_come_in_the_order_of_the_rules(self, bare_box):
        bare_box.fake("iscsiadm", "-m session", stdout="one\n", times=1)
        bare_box.fake("iscsiadm", "-m session", stderr="two\n", status=21, times=1)
        bare_box.fake("iscsiadm", re.compile("^-m (node|session)"), stdout="three\n")
        results = [bare_box.run(["iscsiadm", "-m", "session", "-P", "3"]) for _ in range(3)]
        assert [(r.stdout, r.stderr, r.status) for r in results] == [
            ("one\n", "", 0), ("", "two\n", 21), ("three\n", "", 0)]

    def test_words_match_whole_words(self, loose_box):
        loose_box.fake("iscsiadm", "-m node -T a", status=0)
        assert loose_box.run(["iscsiadm", "-m", "node", "-T", "ab"]).status == 99
        assert loose_box.run(["iscsiadm", "-m", "node", "-T", "a", "-u"]).status == 0

    def test_exact_skip_and_first(self, bare_box):
        bare_box.fake("umount", status=1)
        bare_box.fake("umount", "-f", exact=True, status=2, first=True)
        bare_box.fake("umount", "/a", status=3, skip=1, first=True)
        assert [bare_box.run(["umount", *a]).status for a in (["-f"], ["-f", "x"], ["/a"], ["/a"])] == [2, 1, 1, 3]

    def test_a_side_effect_sees_arguments_number_and_real_commands(self, bare_box):
        bare_box.fake("mount", effect='echo "$FAKE_N $1"; command -v dd; mkdir "$2"; exit 4')
        done = bare_box.run(["mount", "dev with blank", "/tmp/made"])
        assert done.status == 4
        assert done.lines[0] == "1 dev with blank" and not done.lines[1].startswith("/fake")
        assert bare_box.path("/tmp/made").is_dir()
        assert [str(c) for c in bare_box.calls] == ["run mount dev with blank /tmp/made"]

    def test_the_real_command_and_a_kill(self, bare_box):
        bare_box.fake("dd", real=True, times=1)
        bare_box.fake("dd", kill=signal.SIGTERM, stdout="never")
        assert bare_box.run(["dd", "if=/dev/zero", "of=/tmp/x", "bs=4", "count=1"]).status == 0
        assert bare_box.path("/tmp/x").stat().st_size == 4
        assert bare_box.run(["dd"]).status == -signal.SIGTERM

    def test_the_shell_text_and_locale_are_recorded(self, bare_box):
        bare_box.fake("ping")
        bare_box.run(["sh", "-c", "LC_ALL=C ping -W 1 'a b' || true; true"])
        [run] = bare_box.runs("ping")
        assert run == ["-W", "1", "a b"]
        assert run.shell == "LC_ALL=C ping -W 1 'a b' || true; true"
        assert run.lc_all == "C"

    def test_any_byte_comes_back_as_it_was(self, bare_box):
        strange = "\t\n\\x41\\é\x01=|$`\""
        bare_box.fake("mount", strange, exact=True, stdout=strange)
        assert bare_box.run(["mount", strange]).stdout == strange
        assert bare_box.runs("mount") == [[strange]]

    def test_calls_from_many_processes_are_all_there(self, bare_box):
        bare_box.fake("ping", status=1, times=20)
        bare_box.fake("ping")
        bare_box.run(["sh", "-c", "for i in $(seq 40); do { ping $i || echo; } & done; wait"])
        assert sorted(int(run[0]) for run in bare_box.runs("ping")) == list(range(1, 41))


class TestHooks:
    def test_commands_and_sleeps_are_recorded_in_order_and_sleeps_are_instant(self, bare_box):
        bare_box.fake("fuser", status=1)
        call(bare_box, "c.system(b'fuser -mk x'); c.sleep(3000); c.usleep(999999);"
                       "c.popen.restype = ctypes.c_void_p; c.pclose(ctypes.c_void_p(c.popen(b'true', b'r')))")
        assert bare_box.trace() == ["system fuser -mk x", "sleep 3000", "usleep 999999", "popen true"]
        assert bare_box.trace("system", "run") == ["system fuser -mk x", "run fuser -mk x"]
        assert bare_box.shell() == ["fuser -mk x", "true"]

    def test_chosen_calls_fail(self, bare_box):
        bare_box.hook("system", startswith("umount"), ret=256, skip=1, times=1)
        bare_box.hook("mknod", "/dev/sdx", ret=-1, errno=17)
        bare_box.hook("semget", ret=-1, errno=43)
        done = call(bare_box, "for i in range(3): print(c.system(b'umount a || true'))\n"
                              "print(c.mknod(b'/dev/sdx', 0o60660, 8 << 8 | 17), ctypes.get_errno())\n"
                              "print(c.semget(90111, 1, 0o666), ctypes.get_errno())")
        assert done.lines == ["0", "256", "0", "-1 17", "-1 43"]
        assert bare_box.trace("mknod", "semget") == ["mknod /dev/sdx 60660 8:17", "semget 90111 1 666"]
        bare_box.unscripted_ok()

    def test_a_hook_can_change_the_world_and_go_on(self, bare_box):
        bare_box.hook("sleep", "1", through=True, effect="echo changed >/tmp/world", times=1)
        call(bare_box, "c.sleep(1)")
        assert bare_box.path("/tmp/world").read_text() == "changed\n"

    def test_a_hook_can_end_the_program(self, bare_box):
        bare_box.hook("system", "second", kill=signal.SIGKILL)
        assert call(bare_box, "c.system(b'true'); c.system(b'second'); print(1)").status == -signal.SIGKILL

    def test_addresses_are_made_up(self, bare_box):
        bare_box.hook("getaddrinfo", "two", out="fe80::1 10.0.0.1")
        bare_box.hook("getaddrinfo", "none", ret=-2)
        done = call(bare_box, "import socket\nfor name in 'two', 'none':\n"
                              " try: print([a[4][0] for a in socket.getaddrinfo(name, None, type=1)])\n"
                              " except OSError as e: print(e.args[0])")
        assert done.lines == ["['fe80::1', '10.0.0.1']", "-2"]

    def test_record_locks_are_seen(self, bare_box):
        bare_box.hook("fcntl", "lock", ret=-1, errno=11, times=1)
        done = call(bare_box, "import fcntl\nf = open('/tmp/l', 'w')\nfor i in range(2):\n"
                              " try: print(fcntl.lockf(f, fcntl.LOCK_EX | fcntl.LOCK_NB))\n"
                              " except OSError as e: print(e.errno)\nfcntl.lockf(f, fcntl.LOCK_UN)")
        assert done.lines == ["11", "None"]
        assert bare_box.trace("fcntl") == ["fcntl lock /tmp/l", "fcntl lock /tmp/l", "fcntl unlock /tmp/l"]
