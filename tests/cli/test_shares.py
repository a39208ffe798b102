"""winshare_reload and macshare_reload: the mounted volumes of the tree are the shares of the file servers."""

import os
import re
import time

import pytest
from harness.initiator import store

SMB_CONF = "/etc/samba/smb.conf"
SHARES = "/run/remvol/smb-shares.conf"
AFP_SHARES = "/run/remvol/afp-shares.conf"
HEAD = "# Made by winshare_reload from the volumes that are mounted. Changes here are lost.\n"
FOR_MACS = "\tvfs objects = catia fruit streams_xattr\n"


def section(name, read_only=False, options=""):
    return f"[{name}]\n\tpath = /mnt/VV/{name}\n\tread only = {'yes' if read_only else 'no'}\n{options}"


def cutting_off(*names):
    """What Samba is told when clients of these shares are to go."""
    return [["all", "reload-config"], *(["smbd", "close-share", "--", name] for name in names)]


# smbcontrol refuses what begins with a dash and is no option of its own, wherever it stands, unless it is behind "--".
AN_OPTION = re.compile("^([^- ][^ ]* )*(-[^-]|--[^ ])")

# The fake that it runs is the parent of the effect's shell.
KILL_THE_RELOAD = "kill -9 $(cut -d' ' -f4 /proc/$PPID/stat)"


class Shares:
    """A box with Samba (its control program fake, its server the box's first process) and no module for Macs."""

    def __init__(self, box):
        self.box = box
        box.write(SMB_CONF, f"[global]\nworkgroup = W\ninclude = {SHARES}\n")
        box.write("/run/samba/smbd.pid", "1\n")
        box.fake("smbcontrol", AN_OPTION, status=1)
        box.default("smbcontrol")
        self.path = f"/fake/bin:{box.build}/bin"
        self.volumes = 0
        self.sh("rm -rf /usr/lib/*/samba/vfs /usr/lib/samba/vfs")

    def sh(self, text):
        done = self.box.run(["sh", "-c", text], env={"LD_PRELOAD": None, "PATH": "/usr/sbin:/usr/bin:/sbin:/bin"})
        assert done.status == 0, done.stderr
        return done.stdout

    def add(self, name, mounted=True, **keys):
        """Adds a target with one volume to the tree."""
        self.volumes += 1
        store(self.box, f"iqn.t{self.volumes}", slot=self.volumes, luns=[(name, 0, {"fs_type": "ext4", **keys})])
        if mounted:
            self.mount(name)

    def mount(self, name):
        folder = os.fsencode("/mnt/VV/" + name)
        done = self.box.run(["/bin/mkdir", "-p", "--", folder.decode("utf-8", "surrogateescape")])
        assert done.status == 0, done.stderr
        done = self.box.run(["/bin/mount", "-t", "tmpfs", "vol", "/mnt/VV/" + name], env={"LD_PRELOAD": None})
        assert done.status == 0, done.stderr

    def umount(self, name):
        self.sh(f"umount '/mnt/VV/{name}' && rmdir '/mnt/VV/{name}'")

    def reload(self, program="winshare_reload", *options, path=None):
        env = {"LD_PRELOAD": None, "PATH": path or self.path}
        done = self.box.run([self.box.build / "bin" / program, *options], env=env)
        assert (done.status, done.stdout) == (0, "")
        return done.stderr

    def file(self, path=SHARES):
        return self.box.path(path).read_text()

    def told(self):
        calls = [list(call) for call in self.box.runs("smbcontrol")]
        self.box.forget()
        return calls


@pytest.fixture
def shares(box):
    return Shares(box)


def test_a_mounted_volume_becomes_a_share(shares):
    shares.add("Backup")
    assert shares.reload() == ""
    assert shares.file() == HEAD + section("Backup")
    assert shares.told() == [["all", "reload-config"]]
    mode = shares.box.path(SHARES).stat().st_mode
    assert mode & 0o777 == 0o644


def test_a_volume_that_is_not_mounted_is_not_shared(shares):
    shares.add("Mounted")
    shares.add("Absent", mounted=False)
    shares.sh("mkdir /mnt/VV/Absent")
    shares.reload()
    assert shares.file() == HEAD + section("Mounted")


def test_every_volume_of_every_target_is_shared(shares):
    shares.add("A")
    shares.box.tree.set({"/iscsi/initiator/id:1/lun/id:2/lun": "3", "/iscsi/initiator/id:1/lun/id:2/share": "B"})
    shares.mount("B")
    shares.add("C")
    shares.reload()
    assert shares.file() == HEAD + section("A") + section("B") + section("C")


@pytest.mark.parametrize("right, read_only", [("0", True), ("1", False), ("", False), (None, False)])
def test_the_access_right_decides_who_may_write(shares, right, read_only):
    shares.add("V", **({} if right is None else {"vol_access_right": right}))
    shares.reload()
    assert shares.file() == HEAD + section("V", read_only)


def test_nothing_is_written_or_told_when_nothing_changed(shares):
    shares.add("V")
    shares.reload()
    shares.told()
    before = shares.box.path(SHARES).stat()
    assert shares.reload() == ""
    after = shares.box.path(SHARES).stat()
    assert (before.st_ino, before.st_mtime_ns) == (after.st_ino, after.st_mtime_ns)
    assert shares.told() == []


def test_a_change_replaces_the_file_in_one_step(shares):
    shares.add("V")
    shares.reload()
    before = shares.box.path(SHARES).stat().st_ino
    shares.box.tree.set("/iscsi/initiator/id:1/lun/id:1/vol_access_right", "0")
    shares.reload()
    assert shares.file() == HEAD + section("V", read_only=True)
    assert shares.box.path(SHARES).stat().st_ino != before
    assert sorted(os.listdir(shares.box.path("/run/remvol"))) == ["smb-shares.conf", "smb-shares.lock"]


def test_withdrawn_shares_are_gone_although_their_volumes_are_mounted(shares):
    shares.add("Photos")
    shares.reload()
    shares.told()
    assert shares.reload("winshare_reload", "--withdraw") == ""
    assert shares.file() == HEAD
    assert shares.told()[-1] == ["smbd", "close-share", "--", "Photos"]
    shares.reload()
    assert "[Photos]" in shares.file()


def test_a_reload_knows_no_other_option(shares):
    done = shares.box.run([shares.box.build / "bin/winshare_reload", "--nothing"], env={"LD_PRELOAD": None})
    assert done.status == 2 and done.stderr.startswith("usage: ")


def test_clients_of_a_share_that_is_gone_are_cut_off(shares):
    for name in ("Stays", "Goes away", "Über"):
        shares.add(name)
    shares.reload()
    shares.told()
    shares.umount("Goes away")
    shares.umount("Über")
    assert shares.reload() == ""
    assert shares.file() == HEAD + section("Stays")
    assert shares.told() == cutting_off("Goes away", "Über")


def test_clients_of_a_share_whose_name_looks_like_an_option_are_cut_off(shares):
    shares.add("-rf")
    shares.reload()
    shares.umount("-rf")
    shares.told()
    assert shares.reload() == ""
    assert shares.told() == cutting_off("-rf")
    assert shares.reload() == "" and shares.told() == []


def test_the_last_share_that_goes_leaves_an_empty_file(shares):
    shares.add("V")
    shares.reload()
    shares.box.tree.delete("/iscsi/initiator/id:1")
    shares.reload()
    assert shares.file() == HEAD


@pytest.mark.parametrize("name", ["two words", "日本語", "Ünïcode – 3", "C# notes", "it's", "a&b", "$HOME", "-rf",
                                  "x" * 120, "(1)", "!", "~", "Stra\u00dfe u\u0308ber", "\U0001f4f7 Fotos",
                                  "\u2764\ufe0f", "\U0001f468\u200d\U0001f469\u200d\U0001f467",
                                  "\U0001f441\ufe0f\u200d\U0001f5e8\ufe0f", "1\ufe0f\u20e3", "\u0645\u06cc\u200c\u062e\u0648\u0627\u0647\u0645"])
def test_unusual_names_are_shared(shares, name):
    shares.add(name)
    assert shares.reload() == ""
    assert shares.file() == HEAD + section(name)


RESERVED = "the file server keeps this name for itself"
FORBIDDEN = "it holds a character that the file server does not allow in names"
CONTROL = "it holds a control character"
INVISIBLE = "it holds a character that is not seen or that turns the text around"
REFUSED = [
    *((name, RESERVED) for name in ("global", "GLOBAL", "Glo bal", "globals", "homes", "Printers", "print$", "IPC$",
                                    "ADMIN$", "C$", "z$", "netlogon", "NetLogon", "SYSVOL", "sys vol")),
    *((name, FORBIDDEN) for name in ("a]b", "a[b", "%U", "50%", "back\\", "mid\\dle", "; x", "a=b", "a,b", "*", "a?",
                                     'a"b', "a:b", "a|b", "<a>")),
    *((name, CONTROL) for name in ("a\nb", "a\tb", "x\r", "a\x7fb", "\x1b[2J", "a\u0085b", "a\u2028b")),
    *((f"a{mark}b", INVISIBLE) for mark in (
        *map(chr, range(0x202a, 0x202f)), *map(chr, range(0x2066, 0x206a)), "\u200e", "\u200f", "\u061c", "\u200b",
        "\u200c", "\u200d", "\u2060", "\ufeff", "\u00ad", "\u034f", "\u3164", "\ufe0f", "\U000e0041")),
    ("\u200bIPC$", INVISIBLE),
    (" lead", "it begins or ends with a blank"),
    ("trail ", "it begins or ends with a blank"),
    ("two  blanks", "it holds several blanks in a row"),
    ("# note", "it begins like a comment"),
    ("bad\udcff", "it is not UTF-8"),
    ("V]\n\tpath = /etc\n[x", CONTROL),
]


@pytest.mark.parametrize("name, why", REFUSED)
def test_a_name_that_cannot_be_carried_is_refused_and_the_others_are_served(shares, name, why):
    shares.add("First")
    shares.add(name)
    shares.add("Last")
    log = shares.reload()
    assert shares.file() == HEAD + section("First") + section("Last")
    assert log.count("\n") == 1 and log.endswith(f'" is not shared: {why}\n'), log
    assert log.startswith('winshare_reload: volume "') and log.isprintable() is False
    assert not any(ord(character) < 32 for character in log[:-1])


def test_the_reload_log_shows_what_is_not_seen(shares):
    shares.add("pay\u202exls.exe")
    assert shares.reload() == f'winshare_reload: volume "pay\\xE2\\x80\\xAExls.exe" is not shared: {INVISIBLE}\n'


@pytest.mark.parametrize("name", ["..", ".", "a/../../../etc", "a/b", "/"])
def test_a_name_that_leads_elsewhere_is_never_shared(shares, name):
    shares.sh("mkdir -p /mnt/VV/a/b /etc && mount -t tmpfs x /mnt/VV/a/b && mount -t tmpfs y /mnt/VV")
    shares.sh("mkdir -p /mnt/VV/a/b && mount -t tmpfs x /mnt/VV/a/b")
    shares.add(name, mounted=False)
    shares.reload()
    assert not shares.box.path(SHARES).exists()


def test_names_that_differ_in_what_is_not_seen_alone_are_one_share(shares):
    shares.add("\u2764\ufe0f")
    shares.add("\u2764")
    log = shares.reload()
    assert shares.file() == HEAD + section("\u2764\ufe0f")
    assert log == 'winshare_reload: volume "\u2764" is not shared: another share has this name\n'


def test_names_that_differ_in_case_alone_are_one_share(shares):
    shares.add("Straße Ä")
    shares.add("straße ä")
    log = shares.reload()
    assert shares.file() == HEAD + section("Straße Ä")
    assert log == 'winshare_reload: volume "straße ä" is not shared: another share has this name\n'


def test_a_share_of_the_administrator_is_not_taken_over(shares):
    shares.box.write(SMB_CONF, f"[global]\n include = {SHARES}\n; [Other]\n [ public ]\npath = /srv/public\n")
    shares.add("Public")
    shares.add("Other")
    log = shares.reload()
    assert shares.file() == HEAD + section("Other")
    assert log == 'winshare_reload: volume "Public" is not shared: another share has this name\n'


TAKEN = 'winshare_reload: volume "{}" is not shared: another share has this name\n'


def refuses(shares, *names):
    """Of volumes with these names and one more, the one more is shared; each of the others has its line."""
    for name in (*names, "Free"):
        shares.add(name)
    assert shares.reload() == "".join(TAKEN.format(name) for name in names)
    assert shares.file() == HEAD + section("Free")


def test_a_share_in_an_included_file_is_not_taken_over(shares):
    shares.box.write(SMB_CONF, f"[global]\ninclude = {SHARES}\nINCLUDE=/etc/samba/more.conf\n[Own]\n")
    shares.box.write("/etc/samba/more.conf", "[Public]\npath = /srv\ninclude = /etc/samba/deep/end.conf\n[Later]\n")
    shares.box.write("/etc/samba/deep/end.conf", "[ Nested ]\npath = /srv/n\n")
    refuses(shares, "public", "LATER", "nested", "own")


def test_a_share_in_a_file_that_takes_the_place_of_smb_conf_is_not_taken_over(shares):
    shares.box.write(SMB_CONF, f"[global]\ninclude = {SHARES}\nconfig file = /etc/samba/other.conf\n")
    shares.box.write("/etc/samba/other.conf", "[Other]\n")
    refuses(shares, "Other")


def test_lines_that_go_on_are_one(shares):
    shares.box.write(SMB_CONF, f"[global]\ninclude = {SHARES}\n include = \\\n  /etc/samba/more.conf\n"
                               "comment = a \\\n[Free]\\\n\n")
    shares.box.write("/etc/samba/more.conf", "[Two \\\nwords]\n")
    refuses(shares, "two words")


def test_files_that_include_each_other_come_to_an_end(shares):
    shares.box.write(SMB_CONF, f"[global]\ninclude = {SHARES}\ninclude = /etc/samba/a.conf\n[S]\n")
    shares.box.write("/etc/samba/a.conf", f"[A]\ninclude = /etc/samba/b.conf\ninclude = {SMB_CONF}\n")
    shares.box.write("/etc/samba/b.conf", "[B]\ninclude = /etc/samba/a.conf\ninclude = /etc/samba/b.conf\n")
    refuses(shares, "A", "B", "S")


def test_an_include_that_differs_from_client_to_client_is_left_alone(shares):
    shares.box.write(SMB_CONF, f"[global]\ninclude = {SHARES}\ninclude = /etc/samba/%m.conf\n[S]\n")
    shares.box.write("/etc/samba/%m.conf", "[M]\n")
    shares.add("M")
    assert shares.reload() == ""
    assert shares.file() == HEAD + section("M")


@pytest.mark.parametrize("what", ["/etc/samba/absent.conf", "/etc/samba", "/etc/samba/pipe", "/dev/zero", ""])
def test_an_include_that_is_no_file_holds_nothing_up(shares, what):
    shares.box.write(SMB_CONF, f"[global]\ninclude = {what}\ninclude = {SHARES}\n[S]\n")
    shares.sh("mkfifo /etc/samba/pipe")
    refuses(shares, "S")


def test_the_generated_file_is_known_by_any_path_to_it(shares):
    """Its own shares are nobody else's, also where a link or a further file leads to it."""
    shares.box.write(SMB_CONF, "[global]\ninclude = /etc/samba/more.conf\n")
    shares.box.write("/etc/samba/more.conf", "include = /etc/samba/link.conf\n")
    shares.sh(f"ln -s {SHARES} /etc/samba/link.conf")
    shares.add("V")
    for _ in range(2):
        shares.reload()
        assert shares.file() == HEAD + section("V")
    assert shares.reload() == ""


REGISTRY = ["include = registry", "registry shares = Yes", "config backend = registry"]


@pytest.mark.parametrize("line", REGISTRY)
def test_a_share_in_the_registry_is_not_taken_over(shares, line):
    shares.box.write(SMB_CONF, f"[global]\ninclude = {SHARES}\n{line}\n")
    shares.box.fake("net", stdout="global\nStored\nAuch Größe\n")
    refuses(shares, "stored", "auch größe")
    assert shares.box.runs("net") == [["conf", "listshares"]]


def test_the_registry_is_not_asked_where_it_is_not_used(shares):
    shares.box.write(SMB_CONF, f"[global]\ninclude = {SHARES}\nregistry shares = no\n[x]\npath = registry\n")
    shares.box.fake("net", stdout="V\n")
    shares.add("V")
    assert shares.reload() == ""
    assert shares.box.runs("net") == []


def test_a_registry_that_cannot_be_read_is_one_line(shares):
    shares.box.write(SMB_CONF, f"[global]\ninclude = {SHARES}\ninclude = registry\n")
    shares.box.fake("net", status=255)
    shares.add("V")
    assert shares.reload() == "winshare_reload: net failed; the shares in Samba's registry are not known\n"
    assert shares.file() == HEAD + section("V")


def test_eight_volumes_of_which_one_is_broken(shares):
    names = ["One", "Two", "Three", "bro]ken", "Five", "Six", "Seven", "Eight"]
    for name in names:
        shares.add(name)
    log = shares.reload()
    assert log.count("\n") == 1
    assert shares.file() == HEAD + "".join(section(name) for name in names if name != "bro]ken")


@pytest.mark.parametrize("state, why", [("3", "it could not be made or mounted"), ("4", "its target showed no disk of it"),
                                        ("5", "its file system is not supported")])
def test_a_volume_that_failed_is_said_and_the_others_are_served(shares, state, why):
    names = [f"V{number}" for number in range(1, 9)]
    for name in names:
        shares.add(name, mounted=name != "V4", enable="1", volume_state=state if name == "V4" else "0")
        shares.box.tree.set(f"/iscsi/initiator/id:{shares.volumes}/conn_state", "1")
    assert shares.reload() == f'winshare_reload: volume "V4" is not shared: {why}\n'
    assert shares.file() == HEAD + "".join(section(name) for name in names if name != "V4")


@pytest.mark.parametrize("keys", [{"conn_state": "0"}, {"conn_state": "3"}, {"lun/id:1/enable": "0"},
                                  {"lun/id:1/volume_state": "1"}, {"lun/id:1/volume_state": "2"}])
def test_a_volume_that_is_not_to_be_there_is_nothing_to_say(shares, keys):
    shares.add("V", mounted=False, enable="1", volume_state="3")
    for key, value in {"conn_state": "1", **keys}.items():
        shares.box.tree.set(f"/iscsi/initiator/id:1/{key}", value)
    assert shares.reload() == ""


def test_slots_that_lost_what_was_in_them_hide_no_others(shares):
    for name in ("A", "B", "C"):
        shares.add(name)
    shares.box.tree.set({"/iscsi/initiator/id:1/lun/id:3/lun": "5", "/iscsi/initiator/id:1/lun/id:3/share": "D"})
    shares.mount("D")
    shares.box.tree.set("/iscsi/initiator/id:2/target", "")
    assert shares.reload() == ""
    assert shares.file() == HEAD + section("A") + section("D") + section("C")


def test_a_hint_when_smb_conf_does_not_include_the_shares(shares):
    shares.box.write(SMB_CONF, f"[global]\n# include = {SHARES}\n")
    shares.add("V")
    assert shares.reload() == f"winshare_reload: {SMB_CONF} does not include {SHARES}; nobody sees the shares\n"
    assert shares.file() == HEAD + section("V")


# --- what is missing ---


def test_without_samba_one_line(shares):
    shares.add("V")
    log = shares.reload(path="/nowhere")
    assert log == f"winshare_reload: Samba is not installed; nobody reads {SHARES}\n"
    assert shares.file() == HEAD + section("V")


def test_without_samba_and_tree_one_line(shares):
    shares.box.tree.stop()
    log = shares.reload(path="/nowhere")
    assert log == "winshare_reload: nothing to do without Samba and without the configuration tree\n"
    assert not shares.box.path(SHARES).exists()


def test_a_stopped_samba_gets_the_file_and_one_line(shares):
    shares.box.path("/run/samba/smbd.pid").unlink()
    shares.add("V")
    assert shares.reload() == "winshare_reload: Samba does not run; it finds the shares when it starts\n"
    assert shares.file() == HEAD + section("V")


def test_a_failing_smbcontrol_is_one_line(shares):
    shares.box.fake("smbcontrol", status=1)
    shares.add("V")
    assert shares.reload() == "winshare_reload: smbcontrol failed; Samba may not know the shares\n"


def test_what_samba_was_not_told_it_is_told_by_the_next_reload(shares):
    for name in ("Stays", "Goes", "Follows"):
        shares.add(name)
    shares.reload()
    shares.umount("Goes")
    shares.box.fake("smbcontrol", status=1, times=3)
    failed = "winshare_reload: smbcontrol failed; Samba may not know the shares\n"
    assert shares.reload() == failed
    shares.umount("Follows")
    assert shares.reload() == failed
    shares.told()
    assert shares.reload() == ""
    assert shares.told() == cutting_off("Goes", "Follows")
    assert shares.reload() == "" and shares.told() == []
    assert sorted(os.listdir(shares.box.path("/run/remvol"))) == ["smb-shares.conf", "smb-shares.lock"]


def test_only_those_who_are_still_in_a_share_are_cut_off_again(shares):
    for name in ("Goes", "Returns"):
        shares.add(name)
    shares.reload()
    shares.umount("Goes")
    shares.umount("Returns")
    shares.box.fake("smbcontrol", "smbd close-share -- Goes", status=1, times=2)
    failed = 'winshare_reload: smbcontrol failed; clients of the share "Goes" may still be in it\n'
    assert shares.reload() == failed
    shares.mount("Returns")
    shares.told()
    assert shares.reload() == failed
    assert shares.told() == cutting_off("Goes")
    assert shares.reload() == ""
    assert shares.told() == cutting_off("Goes")
    assert shares.reload() == "" and shares.told() == []


@pytest.mark.parametrize("killed", ["all reload-config", "smbd close-share -- Goes"])
def test_what_a_killed_reload_left_untold_is_told_by_the_next(shares, killed):
    shares.add("Goes")
    shares.reload()
    shares.umount("Goes")
    shares.box.fake("smbcontrol", killed, effect=KILL_THE_RELOAD, times=1)
    env = {"LD_PRELOAD": None, "PATH": f"{shares.path}:/usr/bin:/bin"}
    assert shares.box.run([shares.box.build / "bin/winshare_reload"], env=env).status == -9
    shares.told()
    assert shares.reload() == ""
    assert shares.told() == cutting_off("Goes")


def test_a_samba_that_does_not_run_is_told_once(shares):
    shares.box.path("/run/samba/smbd.pid").unlink()
    shares.box.fake("smbcontrol", status=1)
    shares.add("V")
    assert "Samba does not run" in shares.reload()
    shares.told()
    assert shares.reload() == "" and shares.told() == []


def test_without_the_tree_the_mounted_volumes_stay_shared(shares):
    shares.add("Stays", vol_access_right="0")
    shares.add("Goes")
    shares.reload()
    shares.told()
    shares.box.tree.stop()
    line = "winshare_reload: the configuration tree does not answer; only shares that are gone are taken out\n"
    assert shares.reload() == line
    assert shares.told() == []
    shares.umount("Goes")
    assert shares.reload() == line
    assert shares.file() == HEAD + section("Stays", read_only=True)
    assert shares.told() == cutting_off("Goes")


def test_a_caller_that_ignores_the_end_of_its_children_reads_of_no_failure(shares):
    shares.add("V")
    done = shares.box.run(["env", "--ignore-signal=CHLD", shares.box.build / "bin/winshare_reload"],
                          env={"LD_PRELOAD": None, "PATH": f"{shares.path}:/usr/bin"})
    assert (done.status, done.stderr) == (0, "")


def test_a_hung_smbcontrol_does_not_hang_the_reload(shares):
    shares.box.fake("smbcontrol", delay=1000, times=1)
    shares.add("V")
    assert shares.reload() == "winshare_reload: smbcontrol failed; Samba may not know the shares\n"


@pytest.mark.unsanitized
@pytest.mark.native
def test_nothing_to_do_takes_less_than_50_ms(shares):
    for number in range(8):
        shares.add(f"V{number}")
    shares.reload()

    def took(**options):
        times = []
        for _ in range(5):
            start = time.monotonic()
            shares.reload(**options)
            times.append(time.monotonic() - start)
        return min(times)

    assert took() < 0.05
    assert took(program="macshare_reload") < 0.05
    shares.box.tree.stop()
    assert took() < 0.05
    assert took(path="/nowhere") < 0.05


def test_reloads_at_the_same_time_leave_the_newest_state(shares):
    shares.add("V")
    env = {"LD_PRELOAD": None, "PATH": shares.path}
    runs = [shares.box.start([shares.box.build / "bin/winshare_reload"], env=env) for _ in range(10)]
    shares.add("W")
    runs += [shares.box.start([shares.box.build / "bin/winshare_reload"], env=env) for _ in range(10)]
    assert [run.wait().status for run in runs] == [0] * 20
    assert shares.file() == HEAD + section("V") + section("W")


# --- Macs ---


def install_modules(shares, *names):
    for name in names or ("catia", "fruit", "streams_xattr"):
        shares.box.write(f"/usr/lib/x86_64-linux-gnu/samba/vfs/{name}.so", "")


def test_macs_use_samba_where_it_has_the_modules(shares):
    install_modules(shares)
    shares.add("V")
    shares.reload()
    assert shares.file() == HEAD + section("V", options=FOR_MACS)


def test_a_file_system_without_attributes_gets_no_options_for_macs(shares):
    install_modules(shares)
    shares.add("Stick", fs_type="vfat")
    shares.reload()
    assert shares.file() == HEAD + section("Stick")


def test_a_missing_module_would_make_the_share_unusable(shares):
    install_modules(shares, "catia", "streams_xattr")
    shares.add("V")
    shares.reload()
    assert shares.file() == HEAD + section("V")


def test_modules_that_the_administrator_chose_are_kept(shares):
    install_modules(shares)
    shares.box.write(SMB_CONF, f"[global]\nVFS Objects = recycle\ninclude = {SHARES}\n")
    shares.add("V")
    shares.reload()
    assert shares.file() == HEAD + section("V")


def test_without_netatalk_nothing_is_said_or_done(shares):
    shares.add("V")
    assert shares.reload("macshare_reload") == ""
    assert not shares.box.path("/run/remvol").exists()


@pytest.fixture
def netatalk(shares):
    shares.box.fake("netatalk")
    shares.box.default("killall")
    shares.box.write("/etc/netatalk/afp.conf", f"[Global]\ninclude = {AFP_SHARES}\n[Mine]\npath = /srv\n")
    return shares


def afp(netatalk, *sections):
    return HEAD.replace("winshare", "macshare") + "".join(sections)


def test_netatalk_gets_the_shares_of_its_own(netatalk):
    install_modules(netatalk)
    netatalk.add("V")
    netatalk.add("R", vol_access_right="0")
    assert netatalk.reload("macshare_reload") == ""
    assert netatalk.file(AFP_SHARES) == afp(netatalk, section("V"), section("R", read_only=True))
    assert netatalk.box.runs("killall") == [["-q", "-HUP", "netatalk"]]
    netatalk.reload("macshare_reload")
    assert len(netatalk.box.runs("killall")) == 1
    netatalk.reload()
    assert FOR_MACS not in netatalk.file()


def test_netatalk_has_name_rules_of_its_own(netatalk):
    for name in ("pay$", "mine", "IPC", "Homes"):
        netatalk.add(name)
    log = netatalk.reload("macshare_reload")
    assert netatalk.file(AFP_SHARES) == afp(netatalk, section("IPC"))
    assert log.splitlines() == [
        f'macshare_reload: volume "pay$" is not shared: {FORBIDDEN}',
        'macshare_reload: volume "mine" is not shared: another share has this name',
        f'macshare_reload: volume "Homes" is not shared: {RESERVED}',
    ]


def test_netatalk_shares_in_included_files_are_not_taken_over(netatalk):
    netatalk.box.write("/etc/netatalk/afp.conf", f"[Global]\ninclude = {AFP_SHARES}\ninclude = /etc/netatalk/a.conf\n")
    netatalk.box.write("/etc/netatalk/a.conf", "[Time Machine]\ninclude = /etc/netatalk/b.conf\n")
    netatalk.box.write("/etc/netatalk/b.conf", "[Media]\n")
    for name in ("time machine", "MEDIA", "pay\u202e", "Free"):
        netatalk.add(name)
    log = netatalk.reload("macshare_reload")
    assert netatalk.file(AFP_SHARES) == afp(netatalk, section("Free"))
    assert [line.split(": ", 2)[2] for line in log.splitlines()] == ["another share has this name"] * 2 + [INVISIBLE]


def test_a_stopped_netatalk_is_one_line(netatalk):
    netatalk.box.fake("killall", status=1)
    netatalk.add("V")
    assert netatalk.reload("macshare_reload") == "macshare_reload: netatalk does not run\n"
    assert netatalk.reload("macshare_reload") == ""


def test_what_netatalk_was_not_told_it_is_told_by_the_next_reload(netatalk):
    netatalk.add("V")
    netatalk.box.fake("killall", effect=KILL_THE_RELOAD, times=1)
    env = {"LD_PRELOAD": None, "PATH": f"{netatalk.path}:/usr/bin:/bin"}
    assert netatalk.box.run([netatalk.box.build / "bin/macshare_reload"], env=env).status == -9
    assert netatalk.reload("macshare_reload") == ""
    assert len(netatalk.box.runs("killall")) == 2


def test_a_system_without_the_utf8_locale_serves_the_same_names(shares):
    shares.sh("rm -rf /usr/lib/locale")
    for name in ("Ünï 日本", "50%", "GLOBAL", "bad\udcff", "A", "a"):
        shares.add(name)
    log = shares.reload()
    assert shares.file() == HEAD + section("Ünï 日本") + section("A")
    assert len(log.splitlines()) == 4
