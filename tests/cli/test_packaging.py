"""What the package puts beside the programs: helpers of the units, the units' sandbox, completion."""

import configparser
import os
import pathlib
import re
import shlex
import signal

import pytest

from harness.initiator import store
from harness.tree import Tree

PACKAGING = pathlib.Path(__file__).resolve().parents[2] / "packaging"
SMB_CONF = "/etc/samba/smb.conf"
SMBD = "/usr/sbin/smbd"
BLOCK = """
# Begin: shares of remote volumes, added by remvol
[global]
   include = /run/remvol/smb-shares.conf
# End: shares of remote volumes
"""


def shipped():
    """The documents that are installed, all in one folder, and the pictures below it."""
    docs = PACKAGING.parent / "docs"
    yield from PACKAGING.parent.glob("*.md")
    yield from (path for path in docs.rglob("*") if path.is_file() and docs / "man" not in path.parents)


def test_the_documents_that_the_manual_pages_name_are_installed():
    named = {name for page in (PACKAGING.parent / "docs/man").iterdir()
             for name in re.findall(r"/usr/share/doc/remvol/([\w.-]+\w)", page.read_text())}
    assert "vv.schema.json" in named and named <= {path.name for path in shipped()}


@pytest.mark.parametrize("path", [path for path in shipped() if path.suffix == ".md"], ids=lambda path: path.name)
def test_the_documents_that_an_installed_one_names_are_installed(path):
    text = path.read_text()
    named = set(re.findall(r"`(?:docs/)?([\w-]+\.(?:md|json|cast|svg))`", text))
    named |= {link.split("/")[-1] for link in re.findall(r"\]\(([^):]*)\)", text)}
    assert named <= {path.name for path in shipped()}


def helper(box, name, *args):
    return box.run([PACKAGING / "helpers" / name, *args], env={"LD_PRELOAD": None})


# --- smb.conf ---


@pytest.fixture
def samba(bare_box):
    """A box with Samba's server in which nothing was included yet."""
    bare_box.run(["rm", "-rf", "/var/lib/remvol", "/etc/samba"])
    bare_box.write(SMBD, "", mode=0o755)
    return bare_box


def configurations(box):
    return sorted(path.name for path in box.path("/etc/samba").iterdir())


@pytest.mark.parametrize("text", ["", "[global]\n", "[global]\n workgroup = W\n\n[homes]\n\n\n", "a\n\n\nb\n\n", "\n"])
def test_the_include_comes_and_goes_without_a_trace(samba, text):
    path = samba.write(SMB_CONF, text, mode=0o640)
    assert helper(samba, "samba-include", "add").status == 0
    assert path.read_text() == text + BLOCK
    assert helper(samba, "samba-include", "add").status == 0
    assert path.read_text() == text + BLOCK
    assert path.stat().st_mode & 0o777 == 0o640
    assert helper(samba, "samba-include", "remove").status == 0
    assert path.read_text() == text
    assert configurations(samba) == ["smb.conf"]


def test_what_came_after_the_include_stays(samba):
    path = samba.write(SMB_CONF, "[global]\n" + BLOCK + "\n[mine]\npath = /srv\n")
    helper(samba, "samba-include", "remove")
    assert path.read_text() == "[global]\n\n[mine]\npath = /srv\n"


def test_an_include_of_the_administrator_is_left_alone(samba):
    text = "[global]\n\tinclude=/run/remvol/smb-shares.conf\n"
    path = samba.write(SMB_CONF, text)
    for action in ("add", "remove"):
        assert helper(samba, "samba-include", action).status == 0
        assert path.read_text() == text


def test_without_samba_nothing_is_included(samba):
    for action in ("add", "remove"):
        assert helper(samba, "samba-include", action).status == 0
    assert not samba.path("/etc/samba").exists()


@pytest.mark.parametrize("text", ["[global]\n", "[global]\n" + BLOCK])
def test_an_include_that_the_administrator_takes_out_stays_out(samba, text):
    """Also one that was there before it was noted that it once came."""
    path = samba.write(SMB_CONF, text)
    helper(samba, "samba-include", "add")
    assert path.read_text() == "[global]\n" + BLOCK
    path.write_text("[global]\n")
    assert helper(samba, "samba-include", "add").status == 0
    assert path.read_text() == "[global]\n"
    helper(samba, "samba-include", "remove")
    helper(samba, "samba-include", "add")
    assert path.read_text() == "[global]\n" + BLOCK


def test_the_include_comes_with_a_samba_that_comes_later(samba):
    helper(samba, "samba-include", "add")
    path = samba.write(SMB_CONF, "")
    assert helper(samba, "samba-include", "add").status == 0
    assert path.read_text() == BLOCK


@pytest.mark.parametrize("meanwhile", ["add", "remove"])
@pytest.mark.parametrize("first", [SMBD, SMB_CONF])
def test_a_samba_that_is_purged_and_comes_back_includes_the_shares_again(samba, first, meanwhile):
    """A package that goes loses its programs, then the packages that look at these are called, then its files go."""
    samba.write(SMB_CONF, "")
    helper(samba, "samba-include", "add")
    samba.path(first).unlink()
    assert helper(samba, "samba-include", meanwhile).status == 0
    samba.path(SMBD).unlink(missing_ok=True)
    path = samba.write(SMB_CONF, "")
    samba.write(SMBD, "", mode=0o755)
    helper(samba, "samba-include", "add")
    assert path.read_text() == BLOCK


@pytest.mark.parametrize("text", ["[global]\n", "[global]\n" + BLOCK], ids=["taken out", "there"])
def test_a_samba_that_is_removed_and_comes_back_to_its_configuration_finds_it_as_it_was(samba, text):
    path = samba.write(SMB_CONF, "[global]\n")
    helper(samba, "samba-include", "add")
    path.write_text(text)
    samba.path(SMBD).unlink()
    assert helper(samba, "samba-include", "add").status == 0
    samba.write(SMBD, "", mode=0o755)
    helper(samba, "samba-include", "add")
    assert path.read_text() == text


def test_a_configuration_without_a_samba_is_left_alone(samba):
    """Samba's client brings it, and takes it along when it goes."""
    samba.path(SMBD).unlink()
    path = samba.write(SMB_CONF, "")
    assert helper(samba, "samba-include", "add").status == 0
    assert path.read_text() == ""
    samba.write(SMBD, "", mode=0o755)
    helper(samba, "samba-include", "add")
    assert path.read_text() == BLOCK


@pytest.mark.parametrize("action, text, program", [("add", "[global]\n", "cat"), ("remove", "[global]\n" + BLOCK, "awk")])
def test_a_program_that_dies_cuts_no_configuration(samba, action, text, program):
    path = samba.write(SMB_CONF, text)
    samba.fake(program, kill=signal.SIGKILL, times=1)
    samba.default(program, real=True)
    assert helper(samba, "samba-include", action).status == 1
    assert samba.runs(program) and path.read_text() == text
    assert configurations(samba) == ["smb.conf"]
    helper(samba, "samba-include", action)
    assert path.read_text() == ("[global]\n" + BLOCK if action == "add" else "[global]\n")


def test_a_configuration_that_is_a_link_stays_one(samba):
    path = samba.write("/srv/samba/smb.conf", "[global]\n")
    samba.path("/etc/samba").mkdir()
    link = samba.path(SMB_CONF)
    link.symlink_to("/srv/samba/smb.conf")
    helper(samba, "samba-include", "add")
    assert link.is_symlink() and path.read_text() == "[global]\n" + BLOCK
    helper(samba, "samba-include", "remove")
    assert link.is_symlink() and path.read_text() == "[global]\n"


def test_what_follows_an_include_without_its_last_line_stays(samba):
    text = "[global]\n" + BLOCK.replace("# End: shares of remote volumes\n", "") + "[mine]\npath = /srv\n"
    path = samba.write(SMB_CONF, text)
    assert helper(samba, "samba-include", "remove").status == 0
    assert path.read_text() == text


def test_samba_include_wants_to_know_what_to_do(samba):
    samba.write(SMB_CONF, "")
    assert helper(samba, "samba-include").status == 2


# --- kernel modules ---

DRIVERS = ["scsi_transport_iscsi", "libiscsi", "libiscsi_tcp", "iscsi_tcp"]
FOLDER = "/usr/local/modules/driver"


@pytest.fixture
def kernel(bare_box):
    """A box whose kernel has the modules, one of them compressed and one built in."""
    for name in DRIVERS:
        path = f"/lib/modules/x/{name}.ko"
        answer = {"libiscsi": path + ".xz", "libiscsi_tcp": "(builtin)"}.get(name, path)
        bare_box.fake("modinfo", f"-n {name}", stdout=answer + "\n", exact=True)
    bare_box.default("modprobe")
    return bare_box


def test_modules_are_linked_and_loaded(kernel):
    done = helper(kernel, "modules")
    assert (done.status, done.stderr) == (0, "")
    links = {path.name: str(path.readlink()) for path in kernel.path(FOLDER).iterdir()}
    assert links == {"scsi_transport_iscsi.ko": "/lib/modules/x/scsi_transport_iscsi.ko",
                     "libiscsi.ko": "/lib/modules/x/libiscsi.ko.xz", "iscsi_tcp.ko": "/lib/modules/x/iscsi_tcp.ko"}
    assert kernel.runs("modprobe") == [["-qa", "iscsi_tcp", "sd_mod"]]


def test_modules_of_an_earlier_kernel_are_replaced(kernel):
    kernel.path(FOLDER).mkdir(parents=True)
    for name in ("libiscsi_tcp", "iscsi_tcp"):
        kernel.path(f"{FOLDER}/{name}.ko").symlink_to("/lib/modules/old/x.ko")
    helper(kernel, "modules")
    assert not kernel.path(f"{FOLDER}/libiscsi_tcp.ko").is_symlink()
    assert str(kernel.path(f"{FOLDER}/iscsi_tcp.ko").readlink()) == "/lib/modules/x/iscsi_tcp.ko"


def test_a_missing_module_is_said(bare_box):
    bare_box.fake("modinfo", status=1)
    bare_box.fake("modprobe", status=1)
    done = helper(bare_box, "modules")
    assert done.status == 0
    assert [line.split()[-1] for line in done.stderr.splitlines()] == DRIVERS


def test_modules_are_taken_away_again(kernel):
    helper(kernel, "modules")
    kernel.write(f"{FOLDER}/of-somebody-else.ko", "")
    kernel.default("rmmod")
    assert helper(kernel, "modules", "remove").status == 0
    assert [path.name for path in kernel.path(FOLDER).iterdir()] == ["of-somebody-else.ko"]
    assert [call[-1] for call in kernel.runs("rmmod")] == ["iscsi_tcp", "libiscsi_tcp", "libiscsi", "scsi_transport_iscsi"]
    kernel.path(f"{FOLDER}/of-somebody-else.ko").unlink()
    helper(kernel, "modules", "remove")
    assert not kernel.path("/usr/local/modules").exists()


# --- metrics ---

METRICS = "/var/lib/prometheus/node-exporter"


def test_metrics_are_written_in_one_step(box):
    box.path(METRICS).mkdir(parents=True)
    file = box.write(f"{METRICS}/remvol.prom", "old")
    store(box, "iqn.t1", conn_set=1)
    with file.open() as reader:  # of the collector, which has begun before
        assert helper(box, "metrics").status == 0
        assert reader.read() == "old"
    assert [path.name for path in box.path(METRICS).iterdir()] == ["remvol.prom"]
    assert file.stat().st_mode & 0o777 == 0o644
    assert 'remvol_target_wanted{target="iqn.t1"} 1\n' in file.read_text()


def test_metrics_tell_of_a_tree_that_is_away(box):
    box.path(METRICS).mkdir(parents=True)
    box.tree.stop()
    assert helper(box, "metrics").status == 0
    assert box.path(f"{METRICS}/remvol.prom").read_text().endswith("\nremvol_tree_reachable 0\n")


def test_metrics_that_cannot_be_written_leave_the_old_ones(box):
    box.path("/metrics").mkdir()
    assert box.run(["/bin/mount", "-t", "tmpfs", "-o", "size=4k,nr_inodes=10", "full", "/metrics"],
                   env={"LD_PRELOAD": None}).status == 0
    box.write("/metrics/remvol.prom", "x" * 4096)
    assert helper(box, "metrics", "/metrics").status == 2
    assert [path.name for path in box.path("/metrics").iterdir()] == ["remvol.prom"]
    assert box.path("/metrics/remvol.prom").read_text() == "x" * 4096


@pytest.mark.parametrize("number", [signal.SIGHUP, signal.SIGINT, signal.SIGTERM])
def test_metrics_that_are_ended_leave_nothing_behind(bare_box, number):
    bare_box.path("/metrics").mkdir()
    bare_box.fake("vvstat", delay=1)
    running = bare_box.start([PACKAGING / "helpers/metrics", "/metrics"], env={"LD_PRELOAD": None})
    bare_box.wait_until(lambda: bare_box.runs("vvstat"))
    running.kill(number)
    assert running.wait().status == -number
    assert list(bare_box.path("/metrics").iterdir()) == []


def test_what_killed_metrics_left_is_removed_and_no_others_draft(box):
    old, new, of_another = (box.write(f"/metrics/{name}", "") for name in (".remvol.a1B2c3", ".remvol.d4E5f6", ".remvolt"))
    for path in (old, of_another):
        os.utime(path, (0, 0))
    assert helper(box, "metrics", "/metrics").status == 0
    assert sorted(path.name for path in old.parent.iterdir()) == sorted([new.name, of_another.name, "remvol.prom"])


def test_a_machine_without_the_folder_is_told(box):
    done = helper(box, "metrics", "/nowhere")
    assert done.status != 0 and "/nowhere" in done.stderr


# --- news ---


def news(box, *arguments):
    """What was started: units, and programs without one."""
    assert helper(box, "notify", *arguments).status == 0
    return [words for words in box.runs("systemctl") if "start" in words], box.runs("remvol-notify")


LOOK = ["--quiet", "start", "remvol-notify.service"]


@pytest.mark.parametrize("state, starts", [("inactive", 1), ("failed", 1), ("activating", 2)])
def test_a_change_is_seen_by_a_look_that_begins_after_it(bare_box, state, starts):
    bare_box.path("/run/systemd/system").mkdir(parents=True)
    bare_box.fake("systemctl", "show", stdout=state + "\n")
    bare_box.default("systemctl")
    units, programs = news(bare_box)
    assert units == [LOOK] * starts and programs == []


def test_a_recovery_that_is_given_up_has_a_unit_of_its_own(bare_box):
    bare_box.path("/run/systemd/system").mkdir(parents=True)
    bare_box.default("systemctl")
    bare_box.fake("systemd-escape", "--template=remvol-recovery-failed@.service iqn.a", stdout="escaped\n")
    assert news(bare_box, "--recovery-failed", "iqn.a") == ([["--quiet", "start", "--no-block", "escaped"]], [])


def test_of_a_target_whose_name_is_too_long_for_a_unit_people_are_told_at_once(bare_box):
    bare_box.path("/run/systemd/system").mkdir(parents=True)
    bare_box.default("systemctl")
    bare_box.default("remvol-notify")
    bare_box.fake("systemd-escape", status=1)
    assert news(bare_box, "--recovery-failed", "iqn.long") == ([], [["--recovery-failed", "iqn.long"]])


def test_a_name_is_no_variable_for_systemd():
    assert Unit("remvol-recovery-failed@.service")["Service"]["ExecStart"].startswith(":")


@pytest.mark.parametrize("arguments", [[], ["--recovery-failed", "iqn.a"]])
def test_a_machine_that_goes_down_starts_no_unit_any_more(bare_box, arguments):
    bare_box.path("/run/systemd/system").mkdir(parents=True)
    bare_box.default("systemctl")
    bare_box.fake("systemctl", "is-system-running", stdout="stopping\n", status=1)
    assert news(bare_box, *arguments) == ([], [])


@pytest.mark.parametrize("arguments", [[], ["--recovery-failed", "iqn.a"]])
def test_where_there_is_no_systemd_people_are_told_at_once(bare_box, arguments):
    bare_box.default("remvol-notify")
    assert news(bare_box, *arguments) == ([], [arguments])


# --- the initiator ---

FILES = {"/etc/iscsi/iscsid.conf": "of Debian\n", "/etc/iscsi/initiatorname.iscsi": "InitiatorName=iqn.debian\n"}
MASKED = ["iscsid.service", "iscsid.socket", "open-iscsi.service"]
OF_ANOTHER = "nodes/iqn.other/10.1.1.1,3260,1/default"


@pytest.fixture(params=["/etc/iscsi", "/var/lib/iscsi"])
def place(request):
    """Where the initiator has its records: open-iscsi until 2.1.9, and later."""
    return request.param


@pytest.fixture
def initiator(bare_box, place):
    """A box in which the initiator has its own files, and a target of somebody else."""
    bare_box.run(["rm", "-rf", "/etc/iscsi", "/var/lib/iscsi", "/etc/systemd/system", "/var/lib/remvol"])
    for path, text in {**FILES, f"{place}/{OF_ANOTHER}": "record"}.items():
        bare_box.write(path, text)
    bare_box.default("deb-systemd-helper")
    return bare_box


def masked(box):
    folder = box.path("/etc/systemd/system")
    return sorted(path.name for path in folder.iterdir() if path.is_symlink()) if folder.exists() else []


def test_the_initiator_is_given_back_as_it_was(initiator, place):
    taken = helper(initiator, "initiator", "take")
    assert taken.status == 0
    assert "  recorded: iqn.other at 10.1.1.1:3260\n" in taken.stderr
    assert masked(initiator) == MASKED
    for path in FILES:
        initiator.write(path, "ours")
    ours = initiator.write(f"{place}/nodes/iqn.ours/10.9.0.2,3260/default", "secret")
    again = helper(initiator, "initiator", "take")
    assert (again.status, again.stderr) == (0, "")
    assert helper(initiator, "initiator", "give").status == 0
    assert {path: initiator.path(path).read_text() for path in FILES} == FILES
    assert initiator.path(f"{place}/{OF_ANOTHER}").read_text() == "record"
    assert not ours.exists() and not ours.parent.parent.exists()
    assert masked(initiator) == []
    assert not initiator.path("/var/lib/remvol/initiator").exists()


def test_the_record_of_somebody_elses_session_stays(initiator, place):
    """Made since the installation. Of the targets in the settings none stays, nor one that nobody is connected to."""
    helper(initiator, "initiator", "take")
    initiator.run(["/bin/mount", "-t", "tmpfs", "class", "/sys/class"], env={"LD_PRELOAD": None})
    records = {name: initiator.write(f"{place}/nodes/{name}/10.9.0.2,3260,1/default", "secret")
               for name in ("iqn.new", "iqn.ne", "iqn.ours", "iqn.our", "iqn.left")}
    for number, name in enumerate(["iqn.new", "iqn.ours", "iqn.our"]):
        initiator.write(f"/sys/class/iscsi_session/session{number}/targetname", f"{name}\n")
    initiator.write("/etc/NAS_CFG/vv.xml", "<config><id>\n<target>iqn.ours</target>\n</id></config>\n")
    done = helper(initiator, "initiator", "give")
    said = "remvol: connected and none of the volumes' targets, its record stays: {} at 10.9.0.2:3260\n"
    assert (done.status, done.stderr) == (0, said.format("iqn.new") + said.format("iqn.our"))
    assert [name for name, record in records.items() if record.exists()] == ["iqn.new", "iqn.our"]


def test_without_settings_a_connected_target_is_somebody_elses(initiator, place):
    helper(initiator, "initiator", "take")
    initiator.run(["/bin/mount", "-t", "tmpfs", "class", "/sys/class"], env={"LD_PRELOAD": None})
    record = initiator.write(f"{place}/nodes/iqn.new/fe80::1,3260,1/default", "record")
    initiator.write("/sys/class/iscsi_session/session1/targetname", "iqn.new\n")
    assert " iqn.new at fe80::1:3260\n" in helper(initiator, "initiator", "give").stderr
    assert record.read_text() == "record"


@pytest.mark.parametrize("place", ["/etc/iscsi"])
def test_records_that_an_update_of_the_initiator_has_moved_stay_whose_they_were(initiator):
    helper(initiator, "initiator", "take")
    ours = initiator.write("/etc/iscsi/nodes/iqn.ours/10.9.0.2,3260/default", "secret")
    initiator.run(["mkdir", "-p", "/var/lib/iscsi"])
    initiator.run(["mv", "/etc/iscsi/nodes", "/var/lib/iscsi/"])
    helper(initiator, "initiator", "give")
    assert initiator.path(f"/var/lib/iscsi/{OF_ANOTHER}").read_text() == "record"
    assert not initiator.path("/var/lib/iscsi/nodes/iqn.ours").exists() and not ours.exists()


@pytest.mark.parametrize("unit", ["/dev/null", "/nowhere"])
def test_what_the_administrator_made_of_a_unit_stays(initiator, unit):
    initiator.path("/etc/systemd/system").mkdir(parents=True)
    initiator.path("/etc/systemd/system/open-iscsi.service").symlink_to(unit)
    assert helper(initiator, "initiator", "take").status == 0
    assert masked(initiator) == MASKED
    helper(initiator, "initiator", "give")
    assert masked(initiator) == ["open-iscsi.service"]


def test_an_initiator_without_files_gets_none_back(initiator):
    initiator.run(["rm", "-rf", "/etc/iscsi", "/var/lib/iscsi"])
    assert (helper(initiator, "initiator", "take").stderr) == ""
    for path in FILES:
        initiator.write(path, "ours")
    helper(initiator, "initiator", "give")
    assert not any(initiator.path(path).exists() for path in FILES)


def take_in_part(box):
    """The installation was ended while it saved."""
    box.path("/var/lib/remvol/initiator").mkdir(parents=True)


def test_what_an_ended_installation_had_not_saved_is_saved_by_the_next(initiator, place):
    take_in_part(initiator)
    assert helper(initiator, "initiator", "take").status == 0
    ours = initiator.write(f"{place}/nodes/iqn.ours/10.9.0.2,3260/default", "secret")
    for path in FILES:
        initiator.write(path, "ours")
    helper(initiator, "initiator", "give")
    assert {path: initiator.path(path).read_text() for path in FILES} == FILES
    assert initiator.path(f"{place}/{OF_ANOTHER}").read_text() == "record" and not ours.exists()


@pytest.mark.parametrize("loss", ["rm", "mkdir"])
def test_nothing_is_taken_away_when_nobody_knows_whose_it_is(initiator, place, loss):
    helper(initiator, "initiator", "take")
    lists = "/var/lib/remvol/initiator/records"
    initiator.run(["rm", lists])
    if loss == "mkdir":  # there, and cannot be read
        initiator.run(["mkdir", lists])
    helper(initiator, "initiator", "give")
    assert initiator.path(f"{place}/{OF_ANOTHER}").read_text() == "record"
    assert {path: initiator.path(path).read_text() for path in FILES} == FILES


def test_what_cannot_be_put_back_stays_saved(initiator):
    helper(initiator, "initiator", "take")
    for path in FILES:
        initiator.write(path, "ours")
    initiator.run(["mkdir", "-p", "/etc/iscsi/iscsid.conf.new/iscsid.conf"])  # as on a full disk: no copy is made
    done = helper(initiator, "initiator", "give")
    assert done.status == 1 and "stays in /var/lib/remvol/initiator" in done.stderr
    assert masked(initiator) == MASKED
    assert initiator.path("/var/lib/remvol/initiator/iscsid.conf").read_text() == "of Debian\n"
    assert initiator.path("/etc/iscsi/iscsid.conf").read_text() == "ours"
    initiator.run(["rm", "-r", "/etc/iscsi/iscsid.conf.new"])
    assert helper(initiator, "initiator", "give").status == 0
    assert {path: initiator.path(path).read_text() for path in FILES} == FILES


def test_what_cannot_be_saved_is_not_taken(initiator):
    initiator.run(["mkdir", "-p", "/var/lib/remvol/initiator/records.new"])  # as on a full disk: no list is made
    assert helper(initiator, "initiator", "take").status == 1
    assert masked(initiator) == []


@pytest.mark.parametrize("name", ["iscsid.conf", "initiatorname.iscsi"])
def test_what_may_not_be_on_the_disk_yet_is_not_saved(initiator, name):
    """After a power cut the list of the records would be there, and an empty file beside it."""
    initiator.fake("sync", f"/var/lib/remvol/initiator/{name}", status=1, times=1)
    initiator.default("sync", real=True)
    assert helper(initiator, "initiator", "take").status == 1
    assert not initiator.path("/var/lib/remvol/initiator/records").exists() and masked(initiator) == []
    initiator.forget()
    assert helper(initiator, "initiator", "take").status == 0
    synced = [call[-1].split("/")[-1] for call in initiator.runs("sync")]
    assert synced[:4] == ["iscsid.conf", "initiatorname.iscsi", "active", "records.new"]


def test_a_unit_of_which_nobody_would_know_is_not_masked(initiator):
    listed = "/var/lib/remvol/initiator/masked"
    initiator.run(["mkdir", "-p", listed])  # as on a full disk: it takes no line
    assert helper(initiator, "initiator", "take").status == 1
    assert masked(initiator) == []
    initiator.run(["rmdir", listed])
    assert helper(initiator, "initiator", "take").status == 0
    assert masked(initiator) == MASKED
    helper(initiator, "initiator", "give")
    assert masked(initiator) == []


@pytest.fixture
def units(initiator):
    """A machine on which the initiator's socket runs, and the unit that logs in at start has run."""
    initiator.path("/run/systemd/system").mkdir(parents=True)
    for unit, status in (("iscsid.socket", 0), ("iscsid.service", 3), ("open-iscsi.service", 0)):
        initiator.fake("systemctl", f"-q is-active {unit}", status=status)
    initiator.fake("systemctl", "daemon-reload", effect="ls /etc/systemd/system >/tmp/masked")
    initiator.default("systemctl")
    return initiator


def given(box):
    """What is done with units while the initiator is given back."""
    box.forget()
    assert helper(box, "initiator", "give").status == 0
    return box.runs("systemctl")


@pytest.mark.parametrize("session, action", [(None, "restart"), ("session9", "start")])
def test_what_ran_of_the_initiator_runs_again(units, session, action):
    """A unit that has logged in counts as running, though nothing of it is left; where a session is, it would end that."""
    units.default("iscsiadm")
    taken = helper(units, "initiator", "take")
    assert "connected at start it connects again" in taken.stderr
    assert {call[0] for call in units.runs("systemctl")} == {"-q"}
    units.run(["/bin/mount", "-t", "tmpfs", "class", "/sys/class"], env={"LD_PRELOAD": None})
    if session:
        units.write(f"/sys/class/iscsi_session/{session}/targetname", "iqn.other\n")
    wanted = [["daemon-reload"], ["-q", action, "iscsid.socket"], ["-q", action, "open-iscsi.service"]]
    assert given(units) == wanted
    assert units.runs("iscsiadm") == ([["-m", "node", "--loginall=automatic"]] if session else [])
    assert units.path("/tmp/masked").read_text() == ""


def test_what_ran_is_known_from_before_the_initiator_was_taken(units):
    helper(units, "initiator", "take")
    units.fake("systemctl", "-q is-active", status=3, first=True)
    helper(units, "initiator", "take")
    assert ["-q", "restart", "iscsid.socket"] in given(units)


def test_units_of_which_it_is_not_known_stay_as_they_are(units):
    """What an older package saved says nothing of them."""
    helper(units, "initiator", "take")
    units.run(["rm", "/var/lib/remvol/initiator/active"])
    assert given(units) == []


def test_that_a_recovery_has_failed_is_told_without_the_tree_too():
    """Other news are of what the tree wants."""
    units = pathlib.Path(__file__).parents[2] / "packaging/units"
    assert "Requisite=remvol-tree.service" in (units / "remvol-notify.service").read_text()
    for path in [*units.glob("remvol-notify.service.d/*"), units / "remvol-recovery-failed@.service"]:
        assert "Requisite=" not in path.read_text()


def test_what_was_not_taken_is_not_given_back(initiator):
    assert helper(initiator, "initiator", "give").status == 0
    assert {path: initiator.path(path).read_text() for path in FILES} == FILES
    assert helper(initiator, "initiator").status == 2


# --- the tree at start ---


def settings(share):
    return f"<config><iscsi><initiator><prefix>{share}</prefix></initiator></iscsi></config>"


@pytest.mark.parametrize("saved, copy, loaded", [
    (settings("saved"), settings("copy"), "saved"),
    (settings("saved"), None, "saved"),
    (None, settings("copy"), "copy"),
    ("<config><cut", settings("copy"), "copy"),
    ("<config><cut", "rubbish", None),
    (None, None, None),
])
def test_the_unit_starts_with_the_saved_settings_or_their_copy(bare_box, saved, copy, loaded):
    box = bare_box
    for path, text in (("/etc/NAS_CFG/vv.xml", saved), ("/usr/local/config/vv.xml", copy)):
        if text is not None:
            box.write(path, text)
    service = Unit("remvol-tree.service")["Service"]
    assert service["Type"] == "notify"
    box.tree.start(shlex.split(service["ExecStart"])[1:])
    assert box.tree.get("/iscsi/initiator/prefix") == loaded
    assert box.path("/etc/NAS_CFG/vv.xml.damaged").exists() == (saved is not None and loaded != "saved")


# --- purge ---


def purge(box):
    return box.run(["sh", PACKAGING.parent / "debian/remvol.postrm", "purge"], env={"LD_PRELOAD": None})


def test_a_purge_leaves_no_settings(bare_box):
    """Also not those that a program wrote when it was killed: all of them have secrets."""
    for name in ("vv.xml", "vv.xml.damaged", "vv.xml.77.tmp"):
        bare_box.write(f"/etc/NAS_CFG/{name}", settings("saved"))
    for name in ("vv.xml", ".vv.xml.77.kept", ".vv.xml.78.new"):
        bare_box.write(f"/usr/local/config/{name}", settings("copy"))
    done = purge(bare_box)
    assert (done.status, done.stdout, done.stderr) == (0, "", "")
    for folder in ("/etc/NAS_CFG", "/usr/local/config"):
        assert not bare_box.path(folder).exists()
    assert purge(bare_box).status == 0


def test_a_purge_leaves_what_is_somebody_elses(bare_box):
    bare_box.write("/usr/local/config/other.xml", "")
    bare_box.write("/usr/local/config/.vv.xmlx", "")
    assert purge(bare_box).status == 0
    assert sorted(path.name for path in bare_box.path("/usr/local/config").iterdir()) == [".vv.xmlx", "other.xml"]


# --- units ---

# Each of these gives a unit a mount namespace of its own, systemd.exec(5): what it mounts is seen by nobody else.
PRIVATE_MOUNTS = """PrivateMounts PrivateTmp PrivateDevices ProtectSystem ProtectHome ProtectKernelTunables
    ProtectKernelModules ProtectKernelLogs ProtectControlGroups ProtectProc ProcSubset ReadOnlyPaths ReadWritePaths
    InaccessiblePaths NoExecPaths ExecPaths BindPaths BindReadOnlyPaths TemporaryFileSystem MountFlags MountAPIVFS
    RootDirectory RootImage MountImages ExtensionImages DynamicUser PrivateUsers PrivateIPC NetworkNamespacePath
    RuntimeDirectory StateDirectory""".split()


class Unit(configparser.RawConfigParser):
    def __init__(self, name):
        super().__init__(strict=False, comment_prefixes="#", inline_comment_prefixes=None, delimiters="=")
        self.optionxform = str
        self.read(PACKAGING / "units" / name)
        if "tree" in name:
            self.read(PACKAGING / "units/remvol-tree.service.d/tree.conf")


@pytest.mark.parametrize("name", ["remvol.service", "remvol-events.service", "remvol-keeper.service"])
def test_a_unit_that_mounts_for_others_has_no_mounts_of_its_own(name):
    service = Unit(name)["Service"]
    assert not set(PRIVATE_MOUNTS) & set(service)
    assert service["NoNewPrivileges"] == "yes" and service["UMask"] == "0077"
    assert {"CapabilityBoundingSet", "SystemCallFilter", "RestrictNamespaces", "MemoryDenyWriteExecute"} <= set(service)
    assert service["DevicePolicy"] == "closed" and service["ProtectClock"] == "yes"


def capabilities(name):
    lines = re.findall(r"^CapabilityBoundingSet=(.*)$", (PACKAGING / "units" / name).read_text(), re.M)
    return set(" ".join(lines).split())


def test_whoever_has_people_told_they_are_told_with_the_same_rights():
    """A mail server's programs become its user and give it their files."""
    for name in ("remvol-notify.service", "remvol-recovery-failed@.service"):
        assert Unit(name)["Service"]["ExecStart"].lstrip(":").startswith("/usr/bin/remvol-notify")
    assert {"CAP_CHOWN", "CAP_SETUID", "CAP_SETGID"} <= capabilities("remvol-notify.service.d/notify.conf")
    assert "--notifier /usr/lib/remvol/notify" in Unit("remvol-events.service")["Service"]["ExecStart"]


@pytest.mark.parametrize("path", sorted((PACKAGING / "units").glob("*.service")), ids=lambda path: path.name)
def test_what_a_unit_starts_is_installed(path):
    helpers = {p.name for p in (PACKAGING / "helpers").iterdir()}
    ours = {"remvol", "ktree", "remvol-events", "remvol-keeper", "remvol-notify", "winshare_reload", "macshare_reload"}
    started = [pathlib.PurePath(name) for name in re.findall(r"^Exec\w+=[-+:]?(\S+)", path.read_text(), re.M)]
    assert started
    for program in started:
        places = {"/usr/lib/remvol": helpers, "/usr/bin": ours, "/bin": {"sh"}}
        assert program.name in places[str(program.parent)]


def test_a_unit_that_looks_at_volumes_may_write_to_them():
    """A strict ProtectSystem makes every mount read-only in the unit: each volume would look as if it had become so."""
    assert Unit("remvol-metrics.service")["Service"]["ProtectSystem"] == "strict"
    text = (PACKAGING / "units/remvol-metrics.service").read_text()
    assert re.search(r"^ReadWritePaths=-/mnt/VV$", text, re.M)


# --- completion ---


class Completion:
    def __init__(self, box):
        self.box = box

    def __call__(self, line):
        """The completions that bash offers at the end of `line`, whose words are parted by single blanks."""
        words = line.split(" ")
        script = f"""
            . {PACKAGING}/completion/{words[0]}
            COMP_WORDS=({shlex.join(words)})
            COMP_CWORD={len(words) - 1} COMP_LINE={shlex.quote(line)} COMP_POINT={len(line)}
            function=$(complete -p {words[0]} | sed -n 's/.*-F \\([^ ]*\\).*/\\1/p')
            $function {words[0]} "${{COMP_WORDS[COMP_CWORD]}}" "${{COMP_WORDS[COMP_CWORD-1]}}"
            printf '%s\\n' "${{COMPREPLY[@]}}" """
        done = self.box.run(["bash", "--norc", "-c", script], env={"LD_PRELOAD": None})
        assert (done.status, done.stderr) == (0, ""), done.stderr
        return [word for word in done.stdout.split("\n") if word]


@pytest.fixture
def complete(box):
    store(box, "iqn.t1", ip="10.9.0.2", luns=[("Two words", 3)])
    store(box, "iqn.t2", slot=2, ip=None, luns=[("q'uote", 3)])
    return Completion(box)


def test_every_command_is_completed(complete):
    usage = complete.box.remvol("--help").stdout
    offered = complete("remvol --")
    for word in usage.split():
        if word.startswith("--"):
            assert word in offered
    assert {"--oiscsi_evt_reopen", "--oiscsi_evt_recover", "--check_share_name", "--help"} <= set(offered)


@pytest.mark.parametrize("line, offered", [
    ("remvol --del_l", ["--del_lun"]),
    ("remvol --add ", ["-n", "-l", "-i", "-p", "-s", "-c"]),
    ("remvol --add -n iqn.t1 -c 1 ", ["-l", "-i", "-p", "-s", "-U", "-P"]),
    ("remvol --connect -n ", ["iqn.t1", "iqn.t2"]),
    ("remvol --connect -n iqn.t2", ["iqn.t2"]),
    ("remvol --connect -n iqn.t1 ", []),
    ("remvol --del_lun -l ", ["3"]),
    ("remvol --check_share_name -s ", ["Two\\ words", "q\\'uote"]),
    ("remvol --search -p ", ["3260"]),
    ("remvol --search -i ", ["10.9.0.2"]),
    ("remvol --modify -c ", ["0", "1"]),
    ("remvol -d ", ["0", "1", "2", "3"]),
    ("remvol --add -P ", []),
    ("remvol --init ", []),
    ("vvstat --no", ["--noheadings"]),
    ("vvstat -o si", ["SIZE", "SINCE"]),
    ("vvstat -o +share,ta", ["+share,TARGET"]),
    ("vvstat iqn.", ["iqn.t1", "iqn.t2"]),
    ("vvstat Tw", ["Two\\ words"]),
    ("ktree -", ["-n", "-s", "-l", "-h", "--help", "-V", "--version"]),
    ("ktree -n ", ["config"]),
    ("ktreec -", ["-S", "-g", "-s", "-d", "-t", "-l", "-D", "-h", "--help", "-V", "--version"]),
    ("ktreec -S ", ["/var/run/ktree_sock_vv"]),
])
def test_completion(complete, line, offered):
    assert complete(line) == offered


COMMANDS = ["discover", "luns", "add", "connect", "disconnect", "format", "delete", "rename-portal", "password", "status"]

# What the shells offer behind a line; bash and zsh keep this order.
COMPLETIONS = [
    ("vv ", [*COMMANDS, "help", "--help", "--version"]),
    ("vv di", ["discover", "disconnect"]),
    ("vv connect ", ["Two words", "q'uote", "iqn.t1", "iqn.t2"]),
    ("vv connect Tw", ["Two words"]),
    ("vv connect --", ["--json", "--help", "--version"]),
    ("vv connect iqn.t1 ", []),
    ("vv format ", ["Two words", "q'uote"]),
    ("vv format q --d", ["--destroy-data"]),
    ("vv format --yes q", ["q'uote"]),
    ("vv add Photos --p", ["--portal", "--password-file"]),
    ("vv add Photos --portal ", ["10.9.0.2:3260"]),
    ("vv add Photos --portal 10.9.0.2 --p", ["--password-file"]),
    ("vv add Photos --target ", ["iqn.t1", "iqn.t2", "iqn.found"]),
    ("vv add Photos --target iqn.found --lun ", ["5"]),
    ("vv add Photos --target iqn.t1 --lun ", []),
    ("vv add Photos --user ", []),
    ("vv add ", []),
    ("vv luns iqn.f", ["iqn.found"]),
    ("vv luns --portal 10.9.0.2 iqn.f", ["iqn.found"]),
    ("vv discover ", ["10.9.0.2:3260"]),
    ("vv status q", ["q'uote"]),
    ("vv nothing --", []),
]
FOUND = {"/temp/vv_search/id:1/name": "iqn.found", "/temp/vv_search_lun/target_name": "iqn.found",
         "/temp/vv_search_lun/err_code": 0, "/temp/vv_search_lun/lun/count": 2,
         "/temp/vv_search_lun/lun/id:1/lun": 4, "/temp/vv_search_lun/lun/id:1/avaliable": 0,
         "/temp/vv_search_lun/lun/id:2/lun": 5, "/temp/vv_search_lun/lun/id:2/avaliable": 1}


@pytest.fixture
def shells(complete):
    """What each shell offers behind a line."""
    box = complete.box
    box.tree.set({"/iscsi/initiator/id:1/port": 3260, "/iscsi/initiator/id:3/target": "iqn.\x1b[2J",
                  "/iscsi/initiator/id:2/ip": "10.9.0.2", "/iscsi/initiator/id:2/port": 3260,
                  "/iscsi/initiator/id:3/ip": "10.9.0.2", "/iscsi/initiator/id:3/port": 3260})
    Tree(box, "/var/run/ktree_sock").start().set(FOUND)

    def lines(argv):
        done = box.run(argv, env={"LD_PRELOAD": None})
        assert (done.status, done.stderr) == (0, ""), done.stderr
        return [word for word in done.stdout.split("\n") if word]

    def bash(line):
        return [shlex.split(word)[0] for word in complete(line)]

    def zsh(line):
        words = line.split(" ")
        script = (f"words=({shlex.join(words)}); CURRENT=$#words; compadd() {{ print -rl -- \"${{(@P)2}}\" }}\n"
                  f"_files() {{ print FILES }}\n. {PACKAGING}/zsh/_vv")
        return [word for word in lines(["zsh", "-f", "-c", script]) if word.startswith(words[-1]) or word == "FILES"]

    def fish(line):
        return lines(["fish", "--no-config", "-c", f"source {PACKAGING}/fish/vv.fish; complete -C {shlex.quote(line)}"])

    return {"bash": bash, "zsh": zsh, "fish": fish}


# fish has an order of its own.
@pytest.mark.parametrize("shell, ordered", [("bash", list), ("zsh", list), ("fish", sorted)], ids=["bash", "zsh", "fish"])
def test_completion_of_vv(shells, shell, ordered):
    for line, offered in COMPLETIONS:
        assert ordered(shells[shell](line)) == ordered(offered), line


@pytest.mark.parametrize("shell", ["bash", "zsh", "fish"])
def test_completion_of_a_file(shells, shell):
    offered = shells[shell]("vv add Photos --password-file /etc/passw")
    assert offered == ["FILES"] if shell == "zsh" else "/etc/passwd" in offered


def test_completion_of_a_word_with_a_blank(complete):
    script = (f". {PACKAGING}/completion/vv; COMP_WORDS=(vv connect 'Two\\ w') COMP_CWORD=2; _vv; "
              "printf '%s\\n' \"${COMPREPLY[@]}\"")
    done = complete.box.run(["bash", "--norc", "-c", script], env={"LD_PRELOAD": None})
    assert done.stdout == "Two\\ words\n"


def test_completion_without_the_tree(complete):
    complete.box.tree.stop()
    assert complete("remvol --connect -n ") == []
    assert complete("vv connect ") == []


# --- the installation ---


def test_what_is_installed_to_another_prefix_finds_its_programs_there(bare_box):
    done = bare_box.run(["cmake", "--install", bare_box.build, "--prefix", "/opt/x"], env={"LD_PRELOAD": None})
    assert done.status == 0, done.stderr
    installed = bare_box.path("/opt/x")
    units = {path.name: path.read_text() for path in (PACKAGING / "units").glob("*.service")}
    for name, text in units.items():
        for folder in ("bin", "lib/remvol"):
            text = text.replace(f"/usr/{folder}/", f"/opt/x/{folder}/")
        assert (installed / "lib/systemd/system" / name).read_text() == text
        for word in text.split():
            program = word.partition("=")[2]
            assert not program.startswith("/opt/x/") or (bare_box.path(program)).exists()
    for helper_file in (PACKAGING / "helpers").iterdir():
        assert (installed / "lib/remvol" / helper_file.name).stat().st_mode & 0o111
    assert (installed / "lib/tmpfiles.d/remvol.conf").exists()
