"""vv: the front end for a person at a terminal."""

import json
import pathlib
import re

import jsonschema
import pytest

from appliance import settings
from harness.documents import strict_schema
from harness.terminal import Terminal
from harness.tree import Tree

T = "iqn.2026-01.org.example:t"
T1, T2 = f"{T}1", f"{T}2"
INITIATOR = "/iscsi/initiator"
SCHEMA = strict_schema("vv.schema.json")

# What the kernel shows of a session as long as there is one.
SESSION = r"""
named() { while [ "$1" != -T ]; do shift; done; printf %s "$2"; }
name=$(named "$@")
s=/sys/class/iscsi_session/session${name##*t}
case "$*" in
*--login)
    mkdir -p "$s"
    echo "$name" >"$s/targetname"
    echo LOGGED_IN >"$s/state"
    for disk in $(cat "/fake/disks/$name"); do
        mkdir -p "$s/device/target2:0:0/2:0:0:${disk%:*}/block/${disk#*:}"
    done ;;
*--logout) rm -r "$s" ;;
esac
"""


class Machine:
    """A box with a portal: targets are offered, logged in to, and have disks."""

    def __init__(self, site):
        self.site, self.box, self.tree = site, site.box, site.tree
        done = self.box.run(["/bin/mount", "-t", "tmpfs", "class", "/sys/class"], env={"LD_PRELOAD": None})
        assert done.status == 0
        self.box.write("/fake/session", SESSION)
        self.box.path("/etc/NAS_CFG").mkdir(exist_ok=True)
        for operation in ("login", "logout"):
            self.box.fake("iscsiadm", re.compile(f"^-m node .*--{operation}$"),
                          effect='sh /fake/initiator/iscsiadm "$@" && sh /fake/session "$@"')
        self.results = Tree(self.box, "/var/run/ktree_sock").start()

    def offers(self, *names, portal="10.9.0.2:3260"):
        lines = "".join(f"{portal},1 {name}\n" for name in names)
        self.box.fake("iscsiadm", "-m discovery", stdout=lines)

    def target(self, name, disks, **disk):
        """Can be logged in to; disks: LUN number to kernel name."""
        self.site.offer(name, disks)
        self.box.write(f"/fake/disks/{name}", " ".join(f"{lun}:{dev}" for lun, dev in disks.items()))
        for dev in disks.values():
            self.site.disk(dev, **disk)

    def store(self, name=T1, **more):
        self.site.store(name, **more)

    def vv(self, *args, env=None, **more):
        return self.box.run(["vv", *args], env=env, **more)

    def says(self, *args, **more):
        """What it says as JSON, after a comparison with its schema."""
        done = self.vv(*args, "--json", **more)
        assert done.stderr == ""
        told = json.loads(done.stdout)
        jsonschema.validate(told, SCHEMA)
        return done.status, told

    def tool_runs(self):
        """The words of every run of the tool that was started, as its first message shows them."""
        return [str(call)[4:] for call in self.box.calls if call.kind == "run" and call.fields[0] == "remvol"]


@pytest.fixture
def machine(site):
    return Machine(site)


@pytest.fixture
def photos(machine):
    """One share whose target can be connected."""
    machine.store(T1, conn_set=0, luns=[("Photos", 1)])
    machine.target(T1, {1: "sdb"})
    return machine


@pytest.fixture
def words(box):
    """The words that the tool is started with: in its place stands a fake."""
    def of():
        return [list(run) for run in box.runs("remvol")]
    box.fake("remvol")
    return of


# --- usage ---

HELP_COMMANDS = ["discover", "luns", "add", "connect", "disconnect", "format", "delete", "rename-portal", "password", "status"]


def test_help_names_every_command(box):
    done = box.run(["vv", "--help"])
    assert done.status == 0
    assert re.findall(r"^  (\w[\w-]*) ", done.stdout.partition("\n\nOptions")[0], re.M) == [*HELP_COMMANDS, "help"]
    told = set(re.findall(r"^  (--[\w-]+)", done.stdout, re.M))
    found = set()
    for command in HELP_COMMANDS[:-1]:
        one = box.run(["vv", command, "--help"]).stdout
        assert one.startswith(f"usage: vv {command} [OPTION...] ")
        found.update(re.findall(r"^  (--[\w-]+)", one, re.M))
    assert found == told


def test_version(box):
    done = box.run(["vv", "--version"])
    assert (done.status, done.stdout[:3]) == (0, "vv ")


@pytest.mark.parametrize("words, said", [
    ([], "a command is missing"), (["bla"], 'there is no command "bla"'), (["connect"], "connect takes one SHARE|TARGET"),
    (["connect", ""], "connect takes one"), (["connect", "a", "b"], "connect takes one"),
    (["connect", "a", "--lun", "1"], "connect takes no --lun"), (["connect", "a", "--yes"], "connect takes no --yes"),
    (["add", "a", "--portal", "10.9.0.2"], "add needs --lun"), (["add", "a", "--bad"], 'unrecognized option "--bad"'),
    (["add", "a", "--lun"], 'an argument is missing after the option "--lun"'),
    (["add", "a", "--lun", "1x"], 'no number of a LUN: "1x"'),
    (["add", "a", "--lun", "-1"], "no number of a LUN"), (["add", "a", "--lun", "99999"], "no number of a LUN"),
    (["add", "a", "--lun", ""], "no number of a LUN"), (["luns", "a", "--portal", ""], "the value of --portal is empty"),
    (["luns", "a", "--user="], "the value of --user is empty"),
    (["luns", "a", "--password-file", "f"], "--password-file needs --user"),
    (["luns", "a", "--user", "u", "--password", "secret"], "a password is never an argument"),
    (["luns", "a", "--user", "u", "--password=secret"], "a password is never an argument"),
])
def test_wrong_usage(box, words, said):
    done = box.run(["vv", *words])
    assert (done.status, done.stdout) == (2, "")
    assert said in done.stderr and done.stderr.endswith("Try 'vv --help'.\n")
    assert not box.trace("run", "set")
    done = box.run(["vv", *words[:1], "--json", *words[1:]])
    told = json.loads(done.stdout)
    jsonschema.validate(told, SCHEMA)
    [outcome] = told["outcomes"]
    assert (done.status, outcome["status"], outcome["outcome"], done.stderr) == (2, 2, "failed", "")
    assert said in outcome["message"] and outcome["command"] == (words[0] if words else "--json")


def test_what_is_no_command_at_all_as_json(box):
    done = box.run(["vv", "", "--json"])
    jsonschema.validate(json.loads(done.stdout), SCHEMA)
    assert done.status == 2 and json.loads(done.stdout)["outcomes"][0]["command"] is None


def test_the_command_comes_first(box):
    told = json.loads(box.run(["vv", "--json", "status"]).stdout)
    jsonschema.validate(told, SCHEMA)
    assert told["outcomes"][0]["message"] == "the command comes first, options behind it"
    done = box.run(["vv", "--yes", "delete", "Photos"])
    assert (done.status, done.stderr) == (2, "vv: the command comes first, options behind it\nTry 'vv --help'.\n")
    assert box.run(["vv", "--yes", "Photos"]).stderr.startswith("vv: a command is missing\n")


def test_an_option_that_takes_no_value(box):
    done = box.run(["vv", "delete", "a", "--yes=no"])
    assert (done.status, done.stderr) == (2, "vv: no value belongs to the option \"--yes\"\nTry 'vv --help'.\n")


def test_help_as_a_command(box):
    assert box.run(["vv", "help"]).stdout == box.run(["vv", "--help"]).stdout != ""
    for command in HELP_COMMANDS[:-1]:
        assert box.run(["vv", "help", command]).stdout == box.run(["vv", command, "--help"]).stdout != ""
    assert box.run(["vv", "help", "status"]).stdout.startswith("usage: vvstat ")
    done = box.run(["vv", "help", "bla"])
    assert done.status == 2 and 'there is no command "bla"' in done.stderr


@pytest.mark.parametrize("portal", ["10.9.0.2:", ":3260", "10.9.0.2:0", "10.9.0.2:65536", "10.9.0.2:port", "[fd00::2",
                                    "[fd00::2]x", "no-such-host.invalid", "[]", "10.9.0.2:3260:1"])
def test_what_is_no_portal_is_refused(machine, words, portal):
    machine.box.hook("getaddrinfo", re.compile("^(no-such|10.9.0.2:3260:1)"), ret=-2)
    done = machine.vv("discover", portal)
    assert (done.status, done.stdout) == (2, "")
    assert done.stderr.startswith("vv: ") and words() == []


def test_without_the_tree(machine):
    machine.tree.stop()
    for command in (["connect", "Photos"], ["disconnect", "Photos"], ["add", "Photos", "--portal", "10.9.0.2", "--lun", "1"],
                    ["luns", "Photos"], ["luns", T1, "--portal", "10.9.0.2"], ["discover", "10.9.0.2"]):
        done = machine.vv(*command)
        assert (done.status, done.stdout) == (3, "")
        assert done.stderr == "vv: the configuration tree cannot be reached; see systemctl status remvol-tree\n"
        assert machine.says(*command)[0] == 3
    assert not machine.box.shell()


def test_without_the_general_tree(machine):
    machine.results.stop()
    for command in (["discover", "10.9.0.2"], ["luns", T1, "--portal", "10.9.0.2"]):
        done = machine.vv(*command)
        assert (done.status, done.stdout) == (3, "")
        assert done.stderr == "vv: the general tree cannot be reached; see systemctl status remvol-general-tree\n"


def test_somebody_who_is_not_root_is_told(machine):
    for command in ("connect", "luns"):
        done = machine.box.run(["/usr/bin/setpriv", "--reuid=65534", "--regid=65534", "--clear-groups", "vv", command, "x"],
                               env={"LD_PRELOAD": None})
        assert (done.status, done.stderr) == (3, "vv: only root may do this\n")


@pytest.mark.native
def test_without_the_tool(photos):
    # The words of the box's PATH without the folder of the programs.
    photos.box.path("/only").mkdir()
    photos.box.path("/only/vv").symlink_to(f"{photos.box.build}/bin/vv")
    done = photos.vv("connect", "Photos", env={"PATH": "/only"})
    assert done.status == 1
    assert "remvol cannot be run" in done.stderr


# --- discover ---


def test_discover_lists_the_targets_and_what_is_configured_of_them(machine):
    machine.store(T1, luns=[("Photos", 1), ("Grüße aus Köln", 2)])
    machine.offers(T2, T1, T1)
    done = machine.vv("discover", "10.9.0.2")
    assert (done.status, done.stderr) == (0, "")
    assert done.stdout == (f"TARGET                     SHARES\n{T1} Photos, Grüße aus Köln\n{T2} \n")
    assert machine.box.shell()[0].startswith("iscsiadm -m discovery -t sendtargets -p 10.9.0.2:3260 -I default")


@pytest.mark.parametrize("portal, given", [
    ("10.9.0.2", "10.9.0.2:3260"), ("10.9.0.2:3261", "10.9.0.2:3261"), ("fd00:9:0::2", "[fd00:9::2]:3260"),
    ("[fd00:9::2]", "[fd00:9::2]:3260"), ("[fd00:9::2]:3261", "[fd00:9::2]:3261"),
])
def test_a_portal_as_people_write_it(machine, portal, given):
    machine.offers(T1, portal=given)
    status, told = machine.says("discover", portal)
    assert (status, told) == (0, {"targets": [{"target": T1, "shares": None}]})
    assert f"-p {given} " in machine.box.shell()[0]


def test_a_portal_by_its_name(machine):
    machine.box.write("/etc/hosts", "10.9.0.7 nas.example.org\n")
    machine.offers(T1, portal="10.9.0.7:3261")
    assert machine.says("discover", "nas.example.org:3261")[1]["targets"][0]["target"] == T1
    assert "-p 10.9.0.7:3261 " in machine.box.shell()[0]


def test_a_portal_that_offers_nothing(machine):
    machine.offers()
    done = machine.vv("discover", "10.9.0.2")
    assert (done.status, done.stdout) == (0, "the portal offers no target to this machine\n")
    assert machine.says("discover", "10.9.0.2") == (0, {"targets": []})


NAME = "iqn.2013-03.com.example:box:initiator-1b2c3d"


def test_what_the_storage_server_is_to_let_in_is_named(photos):
    """The initiator by its own name, which is what a storage server asks for."""
    photos.tree.set(f"{INITIATOR}/iqn", NAME)
    photos.offers()
    assert photos.vv("discover", "10.9.0.2").stdout == f"the portal offers no target to this machine ({NAME})\n"
    done = photos.vv("add", "Music", "--portal", "10.9.0.2", "--lun", "2")
    assert (done.status, done.stderr) == (2, f"vv: the portal 10.9.0.2:3260 offers no target to this machine ({NAME})\n")
    photos.target(T2, {1: "sdc"}, size=4096)  # too small to be listed
    assert photos.vv("luns", T2, "--portal", "10.9.0.2").stdout == f"the target offers no LUN to this machine ({NAME})\n"
    photos.box.fake("iscsiadm", "-m discovery", stderr="iscsiadm: No portals found\n", status=21, first=True)
    assert f"  try:  see whether the storage server lets this machine ({NAME}) in\n" in photos.vv("discover", "10.9.0.2").stderr
    photos.tree.set(f"{INITIATOR}/iqn", "iqn.\x1b[31m")
    assert "lets this machine (iqn.\\x1B[31m) in\n" in photos.vv("discover", "10.9.0.2").stderr
    photos.tree.set(f"{INITIATOR}/iqn", "")
    assert "lets this machine in\n" in photos.vv("discover", "10.9.0.2").stderr


def test_a_portal_that_wants_a_password_for_a_discovery(machine):
    machine.box.fake("iscsiadm", "-m discovery", status=24, stderr=(
        "iscsiadm: Login failed to authenticate with target \n"
        "iscsiadm: discovery login to 10.9.0.2 rejected: initiator failed authorization\n"
        "iscsiadm: Could not perform SendTargets discovery: iSCSI login failed due to authorization failure\n"))
    done = machine.vv("discover", "10.9.0.2")
    assert done.status == 1
    assert ("  why:  the portal wants a user and a password before it names its targets\n"
            "  try:  have the storage server name them without; vv luns, and vv add with --target, need no discovery\n") in done.stderr


def test_an_initiator_whose_daemon_does_not_run(machine):
    machine.box.fake("iscsiadm", "-m discovery", status=20, stderr="iscsiadm: can not connect to iSCSI daemon (111)!\n"
                     "iscsiadm: Could not perform SendTargets discovery: could not connect to iscsid\n")
    assert ("  why:  the initiator's daemon does not run\n"
            "  try:  systemctl start remvol && systemctl restart remvol-keeper; see journalctl -u remvol-keeper\n"
            ) in machine.vv("discover", "10.9.0.2").stderr


SAMPLES = pathlib.Path(__file__).resolve().parents[1] / "samples/iscsiadm/bookworm"  # tests/unit reads those of all releases


def sample(name):
    return (SAMPLES / name).read_text()


def test_a_discovery_that_fails_says_why(machine):
    machine.results.set("/temp/vv_search/id:1/name", "iqn.stale")
    machine.box.fake("iscsiadm", "-m discovery", stderr=sample("discovery-refused.err"), status=8)
    done = machine.vv("discover", "10.9.0.2")
    assert (done.status, done.stdout) == (1, "")
    assert done.stderr.startswith(
        "vv: the portal 10.9.0.2:3260 cannot be asked for its targets\n"
        "  step: discovery\n"
        "  why:  the storage server's machine answers, but nothing listens at that port\n"
        "  try:  look at the port, and whether the storage server's iSCSI service runs\n"
        "  said: iscsiadm: cannot make connection to 10.9.0.2: Connection refused\n")


def test_a_failure_as_json(machine):
    machine.box.fake("iscsiadm", "-m discovery", stderr=sample("discovery-ipv6.err"), status=8)
    status, told = machine.says("discover", "fd00:9::2")
    [outcome] = told["outcomes"]
    assert status == outcome["status"] == 1
    assert (outcome["command"], outcome["outcome"], outcome["step"]) == ("discover", "failed", "discovery")
    assert outcome["why"] == "no network of this machine leads to that address"
    assert outcome["details"] == "iscsiadm: cannot make connection to fd00:9::2: Network is unreachable"


def test_results_of_an_earlier_search_are_not_taken_for_this_ones(machine):
    machine.results.set({"/temp/vv_search/id:1/name": "iqn.stale", "/temp/vv_search/search_done": "1"})
    machine.box.fake("remvol")  # does nothing, and says that all went well
    done = machine.vv("discover", "10.9.0.2")
    assert (done.status, done.stdout) == (1, "")


# --- luns ---


def test_luns_are_listed_with_what_is_on_them(machine):
    machine.store(T1, luns=[("Photos", 1)], conn_set=0)
    machine.target(T1, {1: "sdb", 2: "sdc"}, size=2 << 30)
    machine.box.hook("sys_get_fs_type", "/dev/sdc1", ret=1, first=True)
    machine.box.write("/dev/sdb1", "")
    machine.box.write("/dev/sdc1", "")
    done = machine.vv("luns", T1)
    assert (done.status, done.stderr) == (0, "")
    assert done.stdout == "LUN SIZE FSTYPE SHARE\n  1 2.0G ext4   Photos\n  2 2.0G        \n"
    status, told = machine.says("luns", T1, "--portal", "10.9.0.2")
    assert (status, told) == (0, {"luns": [
        {"lun": 1, "size": 2 << 30, "fstype": "ext4", "share": "Photos"},
        {"lun": 2, "size": 2 << 30, "fstype": None, "share": None}]})
    assert not machine.site.logged_in(T1)
    assert machine.says("luns", "Photos") == (status, told)  # the target of the share


def test_luns_of_a_target_that_is_not_configured_need_a_portal(machine, words):
    done = machine.vv("luns", T1)
    assert (done.status, done.stderr) == (2, "vv: no share or target of this name is configured here; a target needs --portal\n")
    assert words() == []


def test_stale_luns_are_not_shown(machine):
    machine.results.set({"/temp/vv_search_lun/target_name": T1, "/temp/vv_search_lun/err_code": 0,
                         "/temp/vv_search_lun/lun/count": 1, "/temp/vv_search_lun/lun/id:1/lun": 7})
    machine.target(T1, {1: "sdb"}, size=4096)  # too small to be listed
    assert machine.says("luns", T1, "--portal", "10.9.0.2") == (0, {"luns": []})
    assert machine.vv("luns", T1, "--portal", "10.9.0.2").stdout == "the target offers no LUN to this machine\n"


def test_luns_of_a_target_whose_connection_is_lost(photos):
    """Its session shows no LUN, or those of before: that is not what it offers."""
    assert photos.vv("connect", "Photos").status == 0
    photos.box.write("/sys/class/iscsi_session/session1/state", "FAILED\n")
    done = photos.vv("luns", "Photos")
    assert (done.status, done.stdout) == (1, "")
    assert done.stderr.startswith("vv: the target's LUNs cannot be listed\n  step: login\n  why:  the connection was lost\n")
    assert photos.says("luns", T1)[1]["outcomes"][0]["why"] == "the connection was lost"
    photos.box.write("/sys/class/iscsi_session/session1/state", "LOGGED_IN\n")
    assert photos.vv("luns", "Photos").status == 0


def test_luns_of_a_target_that_refuses_the_login(machine):
    machine.box.fake("iscsiadm", re.compile("--login$"), stderr=sample("login-no-secret.err"), status=24, first=True)
    done = machine.vv("luns", T1, "--portal", "10.9.0.2")
    assert (done.status, done.stdout) == (1, "")
    assert ("  step: login\n  why:  the target refused the user name or the password\n"
            "  try:  give those of the storage server: --user NAME") in done.stderr
    assert "authorization failure" in done.stderr


def test_user_and_password_stand_behind_chap_1(machine, words):
    machine.box.write("/pw", "secret of 16 chr\n", mode=0o600)
    machine.vv("luns", T1, "--portal", "10.9.0.2", "--user", "maria", "--password-file", "/pw")
    machine.vv("luns", T1, "--portal", "10.9.0.2", "--user", "maria", "--password-file", "-", input="from stdin")
    machine.vv("luns", T1, "--portal", "[fd00::2]:3261")
    assert words() == [
        ["--search_lun", "-n", T1, "-i", "10.9.0.2", "-p", "3260", "-c", "1", "-U", "maria", "-P", "secret of 16 chr"],
        ["--search_lun", "-n", T1, "-i", "10.9.0.2", "-p", "3260", "-c", "1", "-U", "maria", "-P", "from stdin"],
        ["--search_lun", "-n", T1, "-i", "fd00::2", "-p", "3261", "-c", "0"]]


@pytest.mark.parametrize("content, said", [
    ("", "the password is empty"), ("\n", "the password is empty"), ("a\nb\n", "more than one line"),
    ("a\n\n", "more than one line"), ("a\0b", "more than one line"), ("x" * 128, "more than 127 bytes")])
def test_what_is_no_password_is_refused(machine, words, content, said):
    machine.box.write("/pw", content)
    done = machine.vv("luns", T1, "--portal", "10.9.0.2", "--user", "maria", "--password-file", "/pw")
    assert done.status == 2 and said in done.stderr
    assert words() == []


def test_a_password_of_127_bytes_passes(machine, words):
    machine.box.write("/pw", "x" * 127 + "\n")
    machine.vv("luns", T1, "--portal", "10.9.0.2", "--user", "maria", "--password-file", "/pw")
    assert words()[0][-1] == "x" * 127


def test_a_password_file_that_is_not_there(machine, words):
    done = machine.vv("luns", T1, "--portal", "10.9.0.2", "--user", "maria", "--password-file", "/none")
    assert (done.status, done.stderr) == (2, "vv: /none: No such file or directory\n")
    assert words() == []


@pytest.mark.parametrize("command", [("luns", T1, "--portal", "10.9.0.2"), ("password", "Photos"),
                                     ("add", "Music", "--lun", "2", "--target", T1)])
def test_a_password_that_is_none_as_json(photos, command):
    status, told = photos.says(*command, "--user", "maria", "--password-file", "/none")
    [outcome] = told["outcomes"]
    assert (status, outcome["outcome"], outcome["message"]) == (2, "failed", "/none: No such file or directory")


def test_a_password_without_a_terminal_to_ask_at(machine, words):
    done = machine.vv("luns", T1, "--portal", "10.9.0.2", "--user", "maria")
    assert done.status == 2 and "use --password-file" in done.stderr
    assert words() == []


# --- add ---

ADD = ("add", "Photos", "--portal", "10.9.0.2", "--lun", "1")


def test_add_takes_the_only_target_of_the_portal(machine):
    machine.offers(T1)
    done = machine.vv(*ADD)
    assert (done.status, done.stdout) == (0, f"Photos is added: LUN 1 of {T1}\nconnect it: vv connect Photos\n")
    assert machine.site.target("target") == T1
    assert (machine.site.lun("share"), machine.site.lun("lun")) == ("Photos", "1")
    assert machine.site.target("port") == "3260" and machine.site.target("ip") == "10.9.0.2"


def test_add_lists_several_targets(machine):
    machine.offers(T1, T2)
    before = settings(machine.box)
    done = machine.vv(*ADD)
    assert (done.status, done.stdout) == (2, "")
    assert done.stderr == ("vv: the portal 10.9.0.2:3260 offers several targets, name one\n"
                           f"  --target {T1}\n  --target {T2}\n")
    assert machine.says(*ADD)[1]["outcomes"][0]["message"] == (
        f"the portal 10.9.0.2:3260 offers several targets, name one; --target {T1}; --target {T2}")
    assert settings(machine.box) == before
    assert machine.vv(*ADD, "--target", T2).status == 0
    assert machine.site.target("target") == T2


def test_add_at_a_portal_without_targets(machine):
    machine.offers()
    done = machine.vv(*ADD)
    assert (done.status, done.stderr) == (2, "vv: the portal 10.9.0.2:3260 offers no target to this machine\n")


def test_the_words_of_add(machine, words):
    machine.box.write("/pw", "-P $secret")
    machine.vv("add", "Grüße aus Köln", "--target", T1, "--portal", "[fd00::2]:3261", "--lun", "0", "--user", "-U",
               "--password-file", "/pw")
    assert words() == [["--add", "-n", T1, "-l", "0", "-i", "fd00::2", "-p", "3261", "-s", "Grüße aus Köln",
                        "-c", "1", "-U", "-U", "-P", "-P $secret"]]


def test_a_second_lun_of_a_target_keeps_its_password(machine):
    machine.store(T1, chap=1, chap_name="maria", chap_pwd="the secret", luns=[("Photos", 1)])
    done = machine.vv("add", "Music", "--lun", "2", "--target", T1)
    assert done.status == 0
    assert (machine.site.target("chap"), machine.site.target("chap_pwd")) == ("1", "the secret")
    assert machine.site.lun("share", 2) == "Music"


def test_a_lun_of_a_connected_target_is_mounted_at_once(photos):
    photos.target(T1, {1: "sdb", 2: "sdc"})
    assert photos.vv("connect", "Photos").status == 0
    done = photos.vv("add", "Music", "--lun", "2", "--target", T1, "--portal", "10.9.0.2")
    assert (done.status, done.stdout) == (0, "Music is mounted on /mnt/VV/Music\n"), done.stderr


@pytest.mark.parametrize("words_of, said", [
    (["Photos", "--lun", "2"], f"there is a share Photos already: LUN 1 of {T1}"),
    (["pHotos", "--lun", "2"], f"there is a share Photos already: LUN 1 of {T1}"),
    (["Music", "--lun", "1"], "LUN 1 of this target is the share Photos already"),
    (["a/b", "--lun", "2"], "a/b cannot be the name of a share: it holds a character"),
    (["..", "--lun", "2"], ".. cannot be the name of a share: it names no folder"),
    (["global", "--lun", "2"], "the file server keeps this name for itself"),
    (["a\u202eb", "--lun", "2"], "a\\xE2\\x80\\xAEb cannot be the name of a share"),
    (["x" * 128, "--lun", "2"], "at most 127 bytes"),
    (["Music", "--lun", "2", "--portal", "10.9.0.3"],
     f"this target is configured with the portal 10.9.0.2:3260; to move it: vv rename-portal {T1} --portal 10.9.0.3:3260"),
    (["Music", "--lun", "2", "--portal", "10.9.0.2:3261"], "this target is configured with the portal 10.9.0.2:3260"),
])
def test_what_cannot_be_added_changes_nothing(photos, words_of, said):
    before = settings(photos.box)
    done = photos.vv("add", *words_of, "--target", T1)
    assert (done.status, done.stdout) == (2, "")
    assert said in done.stderr
    assert settings(photos.box) == before and not photos.box.shell()


def test_the_ninth_volume_is_refused(machine):
    for n in range(1, 9):
        machine.store(f"{T}{n}", slot=n, luns=[(f"share{n}", 1)])
    done = machine.vv("add", "more", "--target", T1, "--lun", "2")
    assert (done.status, done.stderr) == (2, "vv: 8 volumes are configured, which is the most\n")


def test_add_without_a_portal_of_a_new_target(machine, words):
    done = machine.vv("add", "Photos", "--lun", "1", "--target", T1)
    assert (done.status, done.stderr) == (2, "vv: add needs --portal, for a target that is not configured yet\n")
    assert words() == []


def test_add_without_a_portal_and_a_target(photos, words):
    done = photos.vv("add", "Music", "--lun", "2")
    assert (done.status, done.stderr) == (2, f"vv: add needs --portal, or --target with one that is configured: {T1}\n")
    photos.tree.set(f"{INITIATOR}/id:1/target", "")
    done = photos.vv("add", "Music", "--lun", "2")
    assert (done.status, done.stderr) == (2, "vv: add needs --portal, for a target that is not configured yet\n")
    assert words() == []


# --- connect and disconnect ---


def test_connect_mounts_the_share(photos):
    done = photos.vv("connect", "Photos")
    assert (done.status, done.stdout) == (0, "Photos is mounted on /mnt/VV/Photos\n"), done.stderr
    assert photos.site.mounted("Photos")


def test_the_steps_are_shown(photos):
    photos.box.sleep_takes(400)
    photos.box.fake("iscsiadm", re.compile("^-m node .*-o update"), delay=0.5)
    photos.box.hook("sys_check_dev", "/dev/sdb1", delay=0.5, first=True)
    done = photos.vv("connect", "Photos")
    assert done.stderr.splitlines() == [f"logging in to {T1} at 10.9.0.2:3260", f"logged in to {T1}",
                                        "Photos: looking at its disk", "Photos: its disk is ready"]


def test_connect_by_the_targets_name_brings_all_its_shares(photos):
    photos.store(T1, conn_set=0, luns=[("Photos", 1), ("Ton & Film", 2)])
    photos.target(T1, {1: "sdb", 2: "sdc"})
    done = photos.vv("connect", T1)
    assert (done.status, done.stdout) == (0, "Photos is mounted on /mnt/VV/Photos\n"
                                             "Ton & Film is mounted on /mnt/VV/Ton & Film\n")
    assert photos.says("connect", T1)[1]["outcomes"][0]["message"] == (
        "Photos is mounted on /mnt/VV/Photos; Ton & Film is mounted on /mnt/VV/Ton & Film")
    assert photos.says("connect", "Ton & Film")[1] == {"outcomes": [
        {"command": "connect", "share": "Ton & Film", "target": T1, "outcome": "done", "status": 0,
         "message": "Ton & Film is mounted on /mnt/VV/Ton & Film", "step": None, "why": None, "advice": None,
         "details": None}]}


def test_a_name_that_is_not_there(photos):
    done = photos.vv("connect", "Fotos")
    assert (done.status, done.stderr) == (2, 'vv: there is no share "Fotos"; there are: Photos\n')
    assert photos.says("disconnect", "Fotos")[0] == 2
    assert not photos.box.shell()


def test_a_login_that_the_target_refuses(photos):
    photos.box.fake("iscsiadm", re.compile("--login$"), stderr=sample("login-no-secret.err"), status=24, first=True)
    done = photos.vv("connect", "Photos")
    assert (done.status, done.stdout) == (1, "")
    assert ("vv: Photos is not mounted as it should be\n"
            "  step: login\n"
            "  why:  the target refused the user name or the password\n"
            "  try:  set those of the storage server: vv password Photos --user NAME\n") in done.stderr
    assert "  said: iscsiadm: initiator reported error (24 - iSCSI login failed due to authorization failure)\n" in done.stderr


def test_a_disk_that_cannot_be_mounted_here(photos):
    photos.box.hook("sys_get_fs_type", "/dev/sdb1", out="reiserfs", first=True)
    done = photos.vv("connect", "Photos")
    assert done.status == 1
    assert "  step: mount\n  why:  what is on its disk cannot be mounted here\n" in done.stderr


def test_a_lun_that_the_target_does_not_show(photos):
    photos.target(T1, {2: "sdb"})
    done = photos.vv("connect", "Photos")
    assert done.status == 1
    assert "is not mounted as it should be" in done.stderr and "still offers" in done.stderr


def test_another_share_of_the_target_may_fail(photos):
    photos.store(T1, conn_set=0, luns=[("Photos", 1), ("Music", 2)])
    photos.target(T1, {1: "sdb", 2: "sdc"})
    photos.box.hook("sys_get_fs_type", "/dev/sdc1", out="reiserfs", first=True)
    assert photos.vv("connect", "Photos").status == 0
    assert photos.vv("connect", "Music").status == 1
    assert photos.vv("connect", T1).status == 1


def test_a_share_that_is_switched_off(photos):
    photos.store(T1, conn_set=0, luns=[("Photos", 1), ("Music", 2, {"enable": 0})])
    photos.target(T1, {1: "sdb", 2: "sdc"})
    assert photos.vv("connect", T1).stdout == "Photos is mounted on /mnt/VV/Photos\n"
    done = photos.vv("connect", "Music")
    assert done.status == 1 and "why:  it is switched off in the settings" in done.stderr


def test_a_target_without_shares(photos):
    photos.store(T2, slot=2, conn_set=0)
    done = photos.vv("connect", T2)
    assert (done.status, done.stderr) == (2, "vv: no share is configured of this target\n")
    assert photos.vv("disconnect", T2).status == 0
    photos.box.write("/sys/class/iscsi_session/session9/targetname", T2 + "\n")
    photos.box.write("/sys/class/iscsi_session/session9/state", "LOGGED_IN\n")
    assert photos.vv("rename-portal", T2, "--portal", "10.9.0.3").status == 1
    assert photos.vv("disconnect", T2).status == 1


def test_what_could_not_be_saved_is_told(photos):
    photos.box.path("/etc/NAS_CFG").rmdir()
    told = "remvol: the settings are not saved, there is no /etc/NAS_CFG"
    assert photos.vv("disconnect", "Photos").stderr == f"  said: {told}\n"
    status, outcome = photos.says("disconnect", "Photos")
    assert (status, outcome["outcomes"][0]["details"]) == (0, told)


def test_two_adds_of_one_name(machine):
    """The second one is told of the first's, whoever of the two it is."""
    machine.offers(T1)
    started = [machine.box.start(["vv", "add", "Photos", "--portal", "10.9.0.2", "--lun", lun]) for lun in "12"]
    ends = sorted(one.wait().status for one in started)
    assert ends[0] == 0 and ends[1] in (1, 2)
    assert machine.site.lun("share") == "Photos" and machine.site.lun("share", 2) is None


def test_two_searches_do_not_mix(machine):
    for n in (1, 2):
        machine.target(f"{T}{n}", {n: f"sd{'ab'[n - 1]}"}, size=n << 30)
    started = [machine.box.start(["vv", "luns", f"{T}{1 + n % 2}", "--portal", "10.9.0.2", "--json"]) for n in range(6)]
    for n, one in enumerate(started):
        done = one.wait()
        assert [lun["lun"] for lun in json.loads(done.stdout)["luns"]] == [1 + n % 2], done.stderr


def test_a_signal_ends_the_tool(photos):
    photos.box.fake("remvol", kill=9)
    done = photos.vv("connect", "Photos")
    assert done.status == 1
    assert "remvol was ended by a signal: Killed" in done.stderr


def test_a_caller_that_ignores_the_end_of_its_children_hears_of_a_failure(photos):
    photos.box.fake("remvol", status=255)
    assert photos.box.run(["env", "--ignore-signal=CHLD", "vv", "connect", "Photos"]).status == 1


def test_the_tool_goes_on_when_the_front_end_is_killed(photos):
    photos.box.fake("winshare_reload", delay=1, stdout="reloaded\n" * 2000)
    running = photos.box.start(["vv", "connect", "Photos"])
    photos.box.wait_until(lambda: photos.site.mounted("Photos"))
    assert photos.box.run(["sh", "-c", f"kill -9 {running.pid}"]).status == 0  # it alone, not its group
    assert running.wait().status == -9
    photos.box.wait_until(lambda: photos.tree.get("/result/connect") == "0")


def test_disconnect(photos):
    assert photos.vv("connect", "Photos").status == 0
    done = photos.vv("disconnect", "Photos")
    assert (done.status, done.stdout) == (0, "Photos is disconnected, and stays so until it is connected\n")
    assert not photos.site.mounted("Photos") and not photos.site.logged_in(T1)
    assert photos.site.target("conn_set") == "0"


def test_disconnect_of_what_is_not_connected(photos):
    assert photos.vv("disconnect", "Photos").status == 0


def test_disconnect_asks_when_other_shares_go_as_well(photos):
    photos.store(T1, conn_set=0, luns=[("Photos", 1), ("Music", 2)])
    photos.target(T1, {1: "sdb", 2: "sdc"})
    assert photos.vv("connect", T1).status == 0
    done = photos.vv("disconnect", "Photos")
    assert (done.status, done.stdout) == (4, "")
    assert "also Music. Go on?" in done.stderr and "--yes" in done.stderr and photos.site.mounted("Music")
    [outcome] = photos.says("disconnect", "Photos")[1]["outcomes"]
    assert outcome["outcome"] == "refused" and "also Music" in outcome["message"]
    assert photos.vv("disconnect", T1).status == 0  # says so itself


def test_yes_asks_nothing(photos):
    photos.store(T1, conn_set=0, luns=[("Photos", 1), ("Music", 2)])
    photos.target(T1, {1: "sdb", 2: "sdc"})
    assert photos.vv("connect", T1).status == 0
    assert photos.vv("disconnect", "Photos", "--yes").status == 0
    assert not photos.site.mounted("Music")


def test_a_volume_that_stays_mounted_is_not_disconnected(photos):
    assert photos.vv("connect", "Photos").status == 0
    photos.box.fake("iscsiadm", re.compile("--logout$"), status=9, stderr="iscsiadm: Could not logout\n", first=True)
    done = photos.vv("disconnect", "Photos")
    assert done.status == 1
    assert "vv: Photos is not disconnected\n" in done.stderr  # behind a step that may be shown


# --- status ---


def test_status_is_vvstat(photos):
    for words in ([], ["-x"], ["--json"], ["Photos"], ["--no-such-option"]):
        there, here = photos.box.run(["vvstat", *words]), photos.vv("status", *words)
        clock = re.compile(r"\d\d:\d\d:\d\d")
        assert (there.status, clock.sub("", there.stdout)) == (here.status, clock.sub("", here.stdout))


# --- hostile text ---


def test_names_do_not_reach_the_terminal_as_they_are(machine):
    machine.store("iqn.\x1b[31mt", conn_set=0, luns=[("a\x1b]0;x\x07b", 1)])
    for done in (machine.vv("connect", "nothing"), machine.vv("connect", "a\x1b]0;x\x07b")):
        assert "\x1b" not in done.stdout + done.stderr
    assert "\\x1B" in machine.vv("connect", "nothing").stderr


def test_what_the_tool_prints_does_not_reach_the_terminal_as_it_is(photos):
    photos.box.fake("iscsiadm", re.compile("--login$"), stderr="iscsiadm: \x1b[2Jgone\n", status=8, first=True)
    done = photos.vv("connect", "Photos")
    assert "\x1b" not in done.stderr and "\\x1B[2Jgone" in done.stderr


@pytest.mark.parametrize("words", ["discover 10.9.0.2", "--help", "add --help", "--version", "add --version"])
def test_a_full_disk_is_a_failure(machine, words):
    machine.offers(T1)
    done = machine.box.run(["sh", "-c", f"vv {words} >/dev/full"])
    assert (done.status, done.stderr) == (1, "vv: write error: No space left on device\n")


@pytest.mark.parametrize("words", [["\x1b[2J"], ["add", "a", "--lun", "\x1b[2J"]])
def test_words_that_are_wrong_do_not_reach_the_terminal_as_they_are(box, words):
    done = box.run(["vv", *words])
    assert done.status == 2 and "\x1b" not in done.stderr


# --- format ---


def connected(machine):
    """Photos is mounted, and Music beside it."""
    machine.store(T1, conn_set=0, luns=[("Photos", 1), ("Music", 2)])
    machine.target(T1, {1: "sdb", 2: "sdc"})
    assert machine.vv("connect", T1).status == 0
    machine.box.fake("dd")
    machine.box.forget()
    return machine


def test_a_format_of_data_is_refused(machine):
    connected(machine)
    before = settings(machine.box)
    for words_of in (["--yes"], []):
        done = machine.vv("format", "Photos", *words_of)
        assert (done.status, done.stdout) == (4, "")
        assert re.match(r"vv: Photos carries data: ext4 on sdb1, \d+B used\n  --destroy-data means", done.stderr)
    assert settings(machine.box) == before and not machine.box.shell()


def test_a_format_of_data_wants_both_words(machine):
    connected(machine).box.fake("mke2fs")
    done = machine.vv("format", "Photos", "--destroy-data")
    assert (done.status, done.stdout) == (4, "")
    assert "no terminal to ask at" in done.stderr and not machine.box.runs("mke2fs")
    done = machine.vv("format", "Photos", "--destroy-data", "--yes")
    assert (done.status, done.stdout) == (0, "Photos is mounted on /mnt/VV/Photos\n"), done.stderr
    assert len(machine.box.runs("mke2fs")) == 1 and machine.site.mounted("Photos")


def test_an_empty_disk_may_be_formatted(machine):
    connected(machine)
    machine.box.hook("sys_get_fs_type", "/dev/sdb1", ret=1, times=1, first=True)  # the look of the front end
    machine.box.fake("mke2fs")
    done = machine.vv("format", "Photos", "--yes")
    assert done.status == 0, done.stderr
    assert machine.box.runs("mke2fs")


# What the platform says of the disk, and what the refusal makes of it.
DATA = {
    "on the disk": ([("sys_get_partition_list", "/dev/sdb", {"ret": 0}),
                     ("sys_get_fs_type", "/dev/sdb", {"ret": 0, "out": "LVM2_member"})], "LVM2_member on sdb"),
    "in two partitions": ([("sys_get_partition_list", "/dev/sdb", {"ret": 2, "out": "sdb1,sdb2"}),
                           ("sys_get_fs_type", "/dev/sdb2", {"ret": 0, "out": "xfs"})], "ext4 on sdb1, xfs on sdb2"),
}


@pytest.mark.parametrize("answers, what", DATA.values(), ids=DATA)
def test_whatever_is_on_the_disk_counts(machine, answers, what):
    connected(machine)
    for function, subject, answer in answers:
        machine.box.hook(function, subject, first=True, **answer)
    done = machine.vv("format", "Photos", "--yes")
    assert done.status == 4 and f"carries data: {what}, " in done.stderr


@pytest.mark.parametrize("function, subject", [("sys_get_fs_type", "/dev/sdb1"), ("sys_get_partition_list", "/dev/sdb")])
def test_a_disk_that_cannot_be_read_is_not_formatted(machine, function, subject):
    connected(machine)
    machine.box.hook(function, subject, ret=-1, first=True)
    done = machine.vv("format", "Photos", "--destroy-data", "--yes")
    assert done.status == 1 and "the disk of Photos cannot be read" in done.stderr
    assert not machine.box.shell()


def test_a_format_of_what_is_not_connected(photos):
    done = photos.vv("format", "Photos", "--yes", "--destroy-data")
    assert (done.status, done.stderr) == (1, "vv: Photos has no disk\n  step: disk\n"
                                             "  why:  its target is not connected, or shows no disk of it\n"
                                             "  try:  vv connect Photos\n")


def test_a_format_of_a_disk_whose_name_is_another_ones(machine):
    connected(machine).tree.set(f"{INITIATOR}/id:1/lun/id:1/dev", "sdc")
    done = machine.vv("format", "Photos", "--yes", "--destroy-data")
    assert done.status == 1 and "it was sdc and is sdb" in done.stderr
    assert not machine.box.shell()


def test_a_format_that_fails_says_so(machine):
    connected(machine).box.fake("dd", stderr="dd: error writing '/dev/sdb1': Input/output error\n", status=1, first=True)
    done = machine.vv("format", "Photos", "--yes", "--destroy-data")
    assert done.status == 1
    assert "vv: Photos is not mounted as it should be\n  step: format\n  why:  no file system could be made on it\n" in done.stderr
    assert "  said: dd: error writing '/dev/sdb1': Input/output error\n" in done.stderr
    machine.box.hook("sys_get_fs_type", "/dev/sdb1", out="reiserfs", first=True)
    assert "  try:  the data is left as it is; a new format destroys it\n" in machine.vv("connect", "Photos").stderr


def test_a_target_is_not_formatted(machine):
    connected(machine)
    assert machine.vv("format", T1, "--yes", "--destroy-data").status == 2


# --- delete ---


def test_delete_asks(machine):
    connected(machine)
    done = machine.vv("delete", "Photos")
    assert (done.status, done.stdout) == (4, "") and machine.site.mounted("Photos")
    done = machine.vv("delete", "Photos", "--yes")
    assert (done.status, done.stdout) == (0, "Photos is deleted; the data is still on the storage server\n")
    assert machine.site.lun("share", 1) == "Music" and machine.site.mounted("Music")
    assert not machine.site.mounted("Photos")


def test_delete_of_a_target(machine):
    connected(machine)
    done = machine.vv("delete", T1, "--yes")
    assert (done.status, done.stdout) == (0, f"{T1} with Photos, Music is deleted; the data is still on the storage server\n")
    assert machine.site.target("target") is None


def test_delete_that_fails(machine):
    connected(machine).box.hook("ktreec_del", f"{INITIATOR}/id:1/lun/id:1", ret=-1)
    done = machine.vv("delete", "Photos", "--yes")
    assert done.status == 1 and done.stderr.startswith("vv: Photos is not deleted\n  step: settings\n")


# --- password ---


def test_a_password_is_stored(photos):
    photos.box.write("/pw", "the secret\n")
    done = photos.vv("password", "Photos", "--user", "maria", "--password-file", "/pw")
    assert (done.status, done.stdout) == (0, "the password is stored\nconnect it: vv connect Photos\n"), done.stderr
    assert [photos.site.target(key) for key in ("chap", "chap_name", "chap_pwd")] == ["1", "maria", "the secret"]
    assert photos.vv("password", "Photos", "--no-password").status == 0
    assert photos.site.target("chap") == "0"


def test_a_password_of_a_connected_target(machine):
    connected(machine).box.write("/pw", "the secret\n")
    words_of = ("password", "Photos", "--user", "maria", "--password-file", "/pw")
    assert machine.vv(*words_of).status == 4 and machine.site.target("chap") == "0"
    done = machine.vv(*words_of, "--yes")
    assert (done.status, done.stdout) == (0, "Photos is mounted on /mnt/VV/Photos\n"), done.stderr


def test_a_wrong_password_of_a_connected_target(machine):
    connected(machine).box.write("/pw", "the secret\n")
    machine.box.fake("iscsiadm", re.compile("--login$"), stderr=sample("login-no-secret.err"), status=24, first=True)
    done = machine.vv("password", "Photos", "--user", "maria", "--password-file", "/pw", "--yes")
    assert (done.status, done.stdout) == (1, "")
    assert "the target refused the user name or the password" in done.stderr


@pytest.mark.parametrize("words_of", [[], ["--user", "u", "--no-password"], ["--no-password", "--password-file", "f"]])
def test_wrong_usage_of_password(photos, words_of):
    assert photos.vv("password", "Photos", *words_of).status == 2
    assert not photos.box.shell()


# --- rename-portal ---


def test_another_portal(photos):
    photos.offers(T1, portal="[fd00::2]:3261")
    done = photos.vv("rename-portal", "Photos", "--portal", "[fd00::2]:3261")
    assert (done.status, done.stdout) == (0, "Photos is reached at [fd00::2]:3261 from now on\n"
                                             "connect it: vv connect Photos\n"), done.stderr
    assert (photos.site.target("ip"), photos.site.target("port")) == ("[fd00::2]", "3261")


def test_a_portal_that_does_not_offer_the_target(photos):
    photos.offers(T2, portal="10.9.0.3:3260")
    done = photos.vv("rename-portal", "Photos", "--portal", "10.9.0.3")
    assert (done.status, done.stdout) == (1, "")
    assert "the portal of Photos is not changed" in done.stderr and "the target is not offered there" in done.stderr
    assert "  try:  see what is: vv discover 10.9.0.3\n" in done.stderr
    assert photos.site.target("ip") == "10.9.0.2"


def test_the_portal_of_a_connected_target_is_not_changed(machine):
    connected(machine)
    done = machine.vv("rename-portal", "Photos", "--portal", "10.9.0.3")
    assert (done.status, done.stderr) == (1, "vv: Photos is connected, and its portal is not changed\n  step: settings\n"
                                             "  why:  a portal is changed while the target is not connected\n"
                                             "  try:  vv disconnect Photos\n")
    assert not machine.box.shell()


@pytest.mark.parametrize("share", ["MYSHARE", "SHARE", "this machine", "PORTAL"])
def test_an_advice_has_the_name_as_it_is(machine, share):
    machine.store(T1, conn_set=0, luns=[(share, 1)])
    machine.target(T1, {1: "sdb"})
    machine.tree.set(f"{INITIATOR}/iqn", NAME)
    word = f"'{share}'" if " " in share else share
    assert machine.vv("connect", share).status == 0
    assert f"  try:  vv disconnect {word}\n" in machine.vv("rename-portal", share, "--portal", "10.9.0.3").stderr
    machine.box.fake("iscsiadm", re.compile("--login$"), stderr=sample("login-no-secret.err"), status=24, first=True)
    assert machine.vv("disconnect", share).status == 0
    assert f"  try:  set those of the storage server: vv password {word} --user NAME\n" in machine.vv("connect", share).stderr


# --- at a terminal ---


def at_a_terminal(machine, *words):
    return Terminal(machine.box, ["vv", *words], whole=True)


@pytest.mark.parametrize("answer, status", [("y", 0), ("Yes", 0), ("n", 4), ("", 4), ("yess", 4)])
def test_a_person_is_asked(machine, answer, status):
    connected(machine)
    terminal = at_a_terminal(machine, "delete", "Photos")
    terminal.wait_for("This ends the use of Photos here; the data stays on the storage server. Go on? [y/N] ")
    terminal.type(answer + "\n")
    assert terminal.end() == status
    assert ("nothing was changed" in terminal.text) == (status == 4)
    assert machine.site.mounted("Photos") == (status == 4)


def test_the_end_of_the_input_is_no_yes(machine):
    connected(machine)
    terminal = at_a_terminal(machine, "delete", "Photos")
    terminal.wait_for("[y/N] ")
    terminal.type("\x04")
    assert terminal.end() == 4


def test_a_password_is_typed_unseen(machine, words):
    terminal = at_a_terminal(machine, "luns", T1, "--portal", "10.9.0.2", "--user", "maria")
    terminal.wait_for("Password of maria: ")
    machine.box.wait_until(lambda: not terminal.shows_what_is_typed())
    terminal.type("the secret\n")
    machine.box.wait_until(words)
    assert terminal.shows_what_is_typed()
    terminal.end()
    assert words()[0][-1] == "the secret" and "secret" not in terminal.text


def test_a_terminal_that_is_interrupted_shows_again_what_is_typed(machine, words):
    terminal = at_a_terminal(machine, "luns", T1, "--portal", "10.9.0.2", "--user", "maria")
    terminal.wait_for("Password of maria: ")
    machine.box.wait_until(lambda: not terminal.shows_what_is_typed())
    terminal.type("half\x03")
    machine.box.wait_until(terminal.shows_what_is_typed)
    assert terminal.end() != 0 and words() == []


MKE2FS = r"""
for done in 10 45 90; do
    printf 'Writing inode tables: %s/100\b\b\b\b\b\b%s/100\b\b\b\b\b\b%s/100\b\b\b\b\b\b\n' $done $done $done
    sleep 0.6
done
"""


def test_a_format_has_a_bar(machine):
    connected(machine).box.fake("mke2fs", effect=MKE2FS)
    terminal = at_a_terminal(machine, "format", "Photos", "--destroy-data")
    terminal.wait_for("This destroys ext4 on sdb1. Go on? [y/N] ")
    terminal.type("y\n")
    terminal.wait_for("Photos: formatting [##")
    assert terminal.end() == 0
    percents = [int(found) for found in re.findall(r"\r\x1b\[KPhotos: formatting \[#* *\] (\d+)%", terminal.text)]
    assert percents == sorted(percents) and len(set(percents)) > 2, terminal.text
    assert "Photos: formatted\r\n" in terminal.text
    assert terminal.text.endswith("Photos is mounted on /mnt/VV/Photos\r\n")


def test_an_interrupted_format_is_told_as_failed(machine):
    connected(machine).box.fake("mke2fs", effect="sleep 20")
    terminal = at_a_terminal(machine, "format", "Photos", "--destroy-data", "--yes")
    machine.box.wait_until(lambda: machine.box.runs("mke2fs"))
    terminal.type("\x03")
    assert terminal.end() == 1
    assert "remvol was ended by a signal: Interrupt" in terminal.text
    assert machine.site.lun("status") != "Formatting 0%" and machine.site.lun("format_state") != "1"


# --- documents ---


TOP = pathlib.Path(__file__).resolve().parents[2]


def commands_of(document):
    """The commands of vv in the document's blocks and, with one share in it, its text."""
    text = (TOP / document).read_text()
    blocks = "".join(re.findall(r"^```\n(.*?)^```", text, re.M | re.S))
    return re.findall(r"^(vv .*)$", blocks, re.M)


@pytest.mark.parametrize("document", ["README.md", "docs/operators-guide.md"])
def test_four_commands_make_a_share(machine, document):
    machine.offers(T1)
    machine.target(T1, {1: "sdb"})
    commands = commands_of(document)
    assert [line.split()[1] for line in commands] == ["discover", "luns", "add", "connect"]
    for line in commands:
        done = machine.box.run(["sh", "-c", line])
        assert done.status == 0, (line, done.stderr)
    assert machine.site.mounted("Photos")


def test_every_command_of_the_guides_text_is_one(photos, words):
    text = (TOP / "docs/operators-guide.md").read_text()
    found = {line for line in re.findall(r"`(vv [^`]*)`", text) if " " in line[3:]}
    assert len(found) >= 8
    for line in found:
        done = photos.box.run(["sh", "-c", line.replace("TARGET", T1)])
        assert "Try 'vv --help'" not in done.stderr, (line, done.stderr)


def test_the_examples_of_the_manual_page_follow_each_other(machine):
    text = (TOP / "docs/man/vv.8").read_text()
    examples = re.search(r"^\.EX\n(.*?)^\.EE$", text, re.M | re.S)[1].replace("\\-", "-").splitlines()
    assert {line.split()[1] for line in examples} == set(HELP_COMMANDS)
    machine.offers(T1)
    machine.offers(T1, portal="10.9.1.2:3260")
    machine.target(T1, {1: "sdb", 2: "sdc"})
    machine.box.fake("iscsiadm", re.compile("-m discovery .*10.9.1.2"), stdout=f"10.9.1.2:3260,1 {T1}\n", first=True)
    for command in ("dd", "mke2fs"):
        machine.box.fake(command)
    machine.box.write("/root/password", "the secret\n", mode=0o600)
    for line in examples:
        done = machine.box.run(["sh", "-c", line])
        assert done.status == 0, (line, done.stdout, done.stderr)
