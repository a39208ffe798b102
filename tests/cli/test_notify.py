"""remvol-notify: people and programs are told what happens to a volume."""

import os
import pathlib
import re
import signal
import socket
import struct
import time

import pytest

from test_vvstat import T1, T1_NAME, a_run_works, change, example, run, session, store_example  # noqa: F401

PACKAGING = pathlib.Path(__file__).resolve().parents[2] / "packaging"
CONFIG = "/etc/remvol/remvol.conf"
PROGRAMS = "/etc/remvol/events.d"


class Journal:
    """A socket where the journal's is, and what came there."""

    def __init__(self, box):
        path = box.path("/run/systemd/journal/socket")
        path.parent.mkdir(parents=True, exist_ok=True)
        self.socket = socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM)
        self.socket.bind(str(path))
        self.socket.setblocking(False)

    def entries(self):
        """Fields by their names, as systemd's native protocol lays them out."""
        found = []
        while True:
            try:
                found.append(self.fields(self.socket.recv(65536)))
            except BlockingIOError:
                return found

    @staticmethod
    def fields(data):
        fields = {}
        while data:
            line, _, data = data.partition(b"\n")
            name, equals, value = line.partition(b"=")
            if not equals:
                size = struct.unpack("<Q", data[:8])[0]
                value, data = data[8:8 + size], data[9 + size:]
            fields[name.decode()] = value.decode()
        return fields


@pytest.fixture
def journal(example):  # noqa: F811
    journal = Journal(example)
    yield journal
    journal.socket.close()


def notify(box, *options, **more):
    return box.run(["remvol-notify", *options], env={"LD_PRELOAD": None}, **more)


def lose(box):
    session(box, 3, T1_NAME, "FAILED")


def program(box, path, text="exit 0", mode=0o755):
    box.write(path, "#!/bin/sh\n" + text + "\n", mode=mode)


TELL = 'printf "%s|" "$REMVOL_EVENT" "$REMVOL_TARGET" "$REMVOL_SHARE" "$REMVOL_MESSAGE" "$@" >>/told; echo >>/told'


def told(box):
    path = box.path("/told")
    return [line.rstrip("|").split("|") for line in path.read_text().splitlines()] if path.exists() else []


def test_a_loss_is_in_the_journal(example, journal):  # noqa: F811
    assert notify(example).status == 0 and journal.entries() == []
    lose(example)
    assert notify(example).status == 0
    first, second = journal.entries()
    assert first["EVENT"] == "lost" and first["PRIORITY"] == "3"
    assert (first["TARGET"], first["SHARE"]) == (T1_NAME, "Backup") and second["SHARE"] == "Fotos 日本"
    assert first["MESSAGE"].startswith("Volume Backup: the connection was lost; ")
    assert first["SYSLOG_IDENTIFIER"] == "remvol-notify"
    assert notify(example).status == 0 and journal.entries() == []


@pytest.mark.parametrize("values, mounted, event, priority", [
    ({"conn_state": "3"}, True, "lost", "3"),
    ({"conn_state": "4"}, True, "volume-failed", "3"),
    ({"lun/id:1/volume_state": "3"}, False, "volume-failed", "3"),
])
def test_events(example, journal, values, mounted, event, priority):  # noqa: F811
    notify(example)
    if not mounted:
        run(example, "/bin/umount", "/mnt/VV/Backup")
    change(example, values)
    notify(example)
    assert [(e["EVENT"], e["PRIORITY"]) for e in journal.entries() if e["SHARE"] == "Backup"] == [(event, priority)]


@pytest.mark.parametrize("device", ["", "sdb"])
def test_a_volume_that_is_being_mounted_has_not_failed(example, journal, device):  # noqa: F811
    notify(example)
    run(example, "/bin/umount", "/mnt/VV/Backup")
    change(example, {"lun/id:1/dev": device})
    with a_run_works(example, T1_NAME):
        notify(example)
        assert journal.entries() == []
    notify(example)
    assert [entry["EVENT"] for entry in journal.entries()] == ["volume-failed"]


def test_a_volume_that_turns_read_only(example, journal):  # noqa: F811
    notify(example)
    run(example, "/bin/mount", "-o", "remount,ro", "/mnt/VV/Backup")
    notify(example)
    assert [e["EVENT"] for e in journal.entries()] == ["read-only"]


def test_a_format_that_is_done(example, journal):  # noqa: F811
    change(example, {"lun/id:1/format_state": "1"})
    notify(example)
    change(example, {"lun/id:1/format_state": "0"})
    notify(example)
    assert [(e["EVENT"], e["PRIORITY"]) for e in journal.entries()] == [("format-done", "5")]


def test_a_format_between_two_looks(example, journal):  # noqa: F811
    """Nothing in the tree tells of it any more, the file system does."""
    notify(example)
    now = int(time.time())
    example.wait_until(lambda: int(time.time()) > now)  # the file system of before is older
    run(example, "/bin/umount", "/mnt/VV/Backup")
    example.disk("sdb", 64 << 20)
    run(example, "/sbin/mke2fs", "-q", "-t", "ext4", "/dev/sdb")
    run(example, "/bin/mount", "/dev/sdb", "/mnt/VV/Backup")
    try:
        assert notify(example).status == 0 and notify(example).status == 0
        assert [(e["EVENT"], e["SHARE"]) for e in journal.entries()] == [("format-done", "Backup")]
    finally:
        run(example, "/bin/umount", "/mnt/VV/Backup")


def test_a_first_volume_that_is_made_between_two_looks(example, journal):  # noqa: F811
    example.tree.delete("/iscsi/initiator")
    assert notify(example).status == 0
    store_example(example)
    run(example, "/bin/umount", "/mnt/VV/Backup")
    example.disk("sdb", 64 << 20)
    run(example, "/sbin/mke2fs", "-q", "-t", "ext4", "/dev/sdb")
    run(example, "/bin/mount", "/dev/sdb", "/mnt/VV/Backup")
    try:
        assert notify(example).status == 0
        assert ("format-done", "Backup") in [(e["EVENT"], e["SHARE"]) for e in journal.entries()]
    finally:
        run(example, "/bin/umount", "/mnt/VV/Backup")


def test_a_volume_that_is_nearly_full(example, journal):  # noqa: F811
    example.write("/mnt/VV/Fotos 日本/file", b"x" * (39 << 19))
    notify(example)
    assert [(e["EVENT"], e["PRIORITY"], e["SHARE"]) for e in journal.entries()] == [("nearly-full", "4", "Fotos 日本")]


def test_a_recovery_that_is_given_up(example, journal):  # noqa: F811
    assert notify(example, "--recovery-failed", "iqn.\x1b").status == 0
    entry, = journal.entries()
    assert (entry["EVENT"], entry["PRIORITY"], entry["TARGET"]) == ("recovery-failed", "3", "iqn.\\x1B")


def test_a_recovery_that_is_given_up_is_told_of_each_volume(example, journal):  # noqa: F811
    assert notify(example, "--recovery-failed", T1_NAME).status == 0
    entries = journal.entries()
    assert [(e["EVENT"], e["PRIORITY"], e["TARGET"], e["SHARE"]) for e in entries] == [
        ("recovery-failed", "3", T1_NAME, "Backup"), ("recovery-failed", "3", T1_NAME, "Fotos 日本")]
    assert entries[0]["MESSAGE"] == ("Volume Backup: the recovery of its target failed and is not tried again; "
                                     "run: vv connect Backup")


def test_the_command_of_a_message_can_be_copied_whatever_the_name_is(example, journal):  # noqa: F811
    notify(example, "--recovery-failed", "iqn.x;reboot")
    assert journal.entries()[0]["MESSAGE"].endswith("; run: remvol --connect -n 'iqn.x;reboot'")


def test_every_event_has_a_text_in_the_catalog(example, journal):  # noqa: F811
    source = (pathlib.Path(__file__).resolve().parents[2] / "platform/notify/history.cpp").read_text()
    ids = re.findall(r'"([0-9a-f]{32})"', source)
    catalog = (PACKAGING / "remvol.catalog").read_text()
    assert len(ids) == len(set(ids)) == 8
    assert sorted(ids) == sorted(re.findall(r"^-- ([0-9a-f]{32})$", catalog, re.M))
    notify(example, "--test")
    assert journal.entries()[0]["MESSAGE_ID"] in ids


@pytest.mark.parametrize("subject", ["A volume became read-only", "A volume is nearly full"])
def test_the_catalog_says_the_commands_that_a_person_uses(subject):
    catalog = (PACKAGING / "remvol.catalog").read_text()
    text, = [text for text in catalog.split("\n-- ") if f"\nSubject: {subject}\n" in text]
    assert re.findall(r"^    (.*)$", text, re.M) == ["vv disconnect @TARGET@", "vv connect @TARGET@"]


def test_the_program_gets_the_event_as_words(example):  # noqa: F811
    notify(example)
    example.write(CONFIG, "# who is told\n\tPROGRAM  /opt/tell me  # here\n")
    program(example, "/opt/tell me", TELL)
    lose(example)
    assert notify(example).status == 0
    assert [line[4:] for line in told(example)] == [["lost", T1_NAME, "Backup"], ["lost", T1_NAME, "Fotos 日本"]]
    assert told(example)[0][:3] == ["lost", T1_NAME, "Backup"]


def test_programs_of_the_folder_run_in_their_order(example):  # noqa: F811
    for name, mode in (("20-b", 0o755), ("10_a", 0o755), ("15-off", 0o644), ("30-c.bak", 0o755), (".hidden", 0o755)):
        program(example, f"{PROGRAMS}/{name}", f"echo {name} >>/order", mode)
    example.path(f"{PROGRAMS}/40-folder").mkdir()
    assert notify(example, "--test").status == 0
    assert example.path("/order").read_text().split() == ["10_a", "20-b"]


def test_a_program_that_fails_does_not_keep_the_others_from_running(example):  # noqa: F811
    program(example, f"{PROGRAMS}/1", "exit 3")
    program(example, f"{PROGRAMS}/2", TELL)
    example.write(CONFIG, "PROGRAM /nowhere\n")
    done = notify(example, "--test")
    assert done.status == 1
    assert "remvol-notify: /nowhere: failed\n" in done.stderr
    assert f"remvol-notify: {PROGRAMS}/1: failed\n" in done.stderr
    assert told(example)[0][0] == "test"


def test_a_caller_that_ignores_the_end_of_its_children_hears_of_a_failure(example):  # noqa: F811
    program(example, f"{PROGRAMS}/1", "exit 3")
    done = example.run(["env", "--ignore-signal=CHLD", "remvol-notify", "--test"], env={"LD_PRELOAD": None})
    assert done.status == 1 and f"remvol-notify: {PROGRAMS}/1: failed\n" in done.stderr


@pytest.mark.long
def test_a_program_that_hangs_is_ended(example):  # noqa: F811
    program(example, f"{PROGRAMS}/1", "trap '' TERM; sleep 1000 & sleep 1000; sleep 1000")
    program(example, f"{PROGRAMS}/2", TELL)
    done = notify(example, "--test", timeout=60)
    assert done.status == 1 and f"{PROGRAMS}/1: took longer than 30 seconds" in done.stderr
    assert told(example)[0][0] == "test"
    example.wait_until(lambda: not any("1000" in argv for argv in example.processes().values()))


def test_a_program_that_hangs_holds_nothing_up(example):  # noqa: F811
    """Neither the other programs, nor those of other events."""
    program(example, f"{PROGRAMS}/1", "exec sleep 1000")
    program(example, f"{PROGRAMS}/2", TELL)
    notify(example)
    lose(example)
    running = example.start(["remvol-notify"], env={"LD_PRELOAD": None})
    example.wait_until(lambda: len(told(example)) == 2)
    assert [line[2] for line in told(example)] == ["Backup", "Fotos 日本"]
    running.kill(signal.SIGTERM)


def test_mail(example):  # noqa: F811
    program(example, "/usr/sbin/sendmail", 'echo "$@" >/mail; cat >>/mail')
    example.write(CONFIG, "MAILADDR admin@example.org\nMAILFROM nas@example.org\n")
    notify(example)
    run(example, "/bin/umount", "/mnt/VV/Backup")
    assert notify(example).status == 0
    words, *lines = example.path("/mail").read_text().splitlines()
    assert words == "-t"
    assert lines[:2] == ["From: nas@example.org", "To: admin@example.org"]
    assert lines[2].startswith("Subject: volume-failed on ")
    assert lines[lines.index("") + 1] == "Volume Backup: is not mounted; mount it again"


def test_a_program_holds_no_mail_up(example):  # noqa: F811
    """Of several events at once all are mailed before the first program runs, which may take its 30 seconds."""
    program(example, "/usr/sbin/sendmail", "cat >/dev/null; echo mail >>/order")
    program(example, f"{PROGRAMS}/1", "echo program >>/order")
    example.write(CONFIG, "MAILADDR root\nPROGRAM /etc/remvol/events.d/1\n")
    notify(example)
    lose(example)
    assert notify(example).status == 0
    assert example.path("/order").read_text().split() == ["mail", "mail", *["program"] * 4]


def test_a_machine_without_mail_says_so(example):  # noqa: F811
    example.run(["rm", "-f", "/usr/sbin/sendmail"])
    example.write(CONFIG, "MAILADDR root\n")
    done = notify(example, "--test")
    assert done.status == 1 and "remvol-notify: sendmail: failed\n" in done.stderr


def test_without_a_journal_standard_error_has_the_message(example):  # noqa: F811
    done = notify(example, "--test")
    assert (done.status, done.stderr) == (0, "A test of what is told when something happens to a volume\n")


@pytest.mark.parametrize("line, said", [
    ("MAILADR root", "no such word: MAILADR"), ("MAILADDR=root", "no such word: MAILADDR=root"),
    ("\x1b[31m root", "no such word: \\x1B[31m"), ("MAILADDR", "MAILADDR has no value"), ("PROGRAM # none", "PROGRAM has no value")])
def test_a_line_of_the_configuration_that_is_none_is_named(example, line, said):  # noqa: F811
    example.write(CONFIG, line + "\n")
    assert f"remvol-notify: remvol.conf: {said}\n" in notify(example, "--test").stderr


@pytest.mark.parametrize("make, why", [(lambda path: path.mkdir(), "Is a directory"),
                                       (lambda path: path.symlink_to(path.name), "Too many levels of symbolic links")])
def test_a_configuration_that_cannot_be_read_is_an_error(example, make, why):  # noqa: F811
    """Nobody knows who is to be told; those in the folder are all the same."""
    example.path("/etc/remvol").mkdir(exist_ok=True)
    make(example.path(CONFIG))
    program(example, f"{PROGRAMS}/1", TELL)
    for options in (["--test"], []):
        done = notify(example, *options)
        assert done.status == 1 and f"remvol-notify: {CONFIG}: {why}\n" in done.stderr
    assert told(example)[0][0] == "test"


def test_words_of_the_configuration_may_be_in_small_letters(example):  # noqa: F811
    example.write(CONFIG, "program /opt/tell\n")
    program(example, "/opt/tell", TELL)
    assert notify(example, "--test").status == 0 and told(example)[0][4] == "test"


def test_without_the_tree(example, journal):  # noqa: F811
    notify(example)
    example.tree.stop()
    done = notify(example)
    assert (done.status, done.stderr) == (3, "remvol-notify: the configuration tree cannot be reached\n")
    assert journal.entries() == []


def test_somebody_who_may_not_read_the_tree_is_told(example, journal):  # noqa: F811
    done = example.run(["/usr/bin/setpriv", "--reuid=65534", "--regid=65534", "--clear-groups", "remvol-notify"],
                       env={"LD_PRELOAD": None})
    assert (done.status, done.stderr) == (3, "remvol-notify: only root may read the configuration tree\n")


def test_looks_at_the_same_time_tell_a_change_once(example, journal):  # noqa: F811
    notify(example)
    lose(example)
    runs = [example.start(["remvol-notify"], env={"LD_PRELOAD": None}) for _ in range(8)]
    assert all(each.wait().status == 0 for each in runs)
    assert sorted(e["SHARE"] for e in journal.entries()) == ["Backup", "Fotos 日本"]


def test_what_is_remembered_is_for_root_alone(example):  # noqa: F811
    notify(example)
    path = example.path("/run/remvol/history")
    assert path.stat().st_mode & 0o777 == 0o600 and path.parent.stat().st_mode & 0o777 == 0o700
    assert "canary" not in path.read_text()


def test_a_damaged_memory_is_begun_anew(example, journal):  # noqa: F811
    example.write("/run/remvol/history", os.urandom(1000))
    assert notify(example).status == 0
    lose(example)
    assert notify(example).status == 0
    assert len(journal.entries()) == 2


@pytest.mark.parametrize("options, status", [(["--help"], 0), (["-h"], 0), (["--version"], 0), (["-V"], 0),
                                             (["--nonsense"], 2), (["more"], 2), (["--recovery-failed"], 2)])
def test_the_usual_options(bare_box, options, status):
    done = notify(bare_box, *options)
    assert done.status == status
    told_there, silent = (done.stdout, done.stderr) if status == 0 else (done.stderr, done.stdout)
    assert told_there and not silent
