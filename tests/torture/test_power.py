"""The judge of the power cuts sees what it is there to see, and the log of writes is replayed as it was written."""

import pytest

import write_log
from power_model import NAME, VOLUMES, WITNESS, Model, Report, Step


def settings(*shares, more=""):
    """A settings file with these volumes."""
    slots = "".join(f"<id><target>{NAME.format(t)}</target><ip>10.9.0.2</ip><port>3260</port><lun>" + "".join(
        f"<id><lun>{VOLUMES[share][1]}</lun><share>{share}</share></id>" for share in shares if VOLUMES[share][0] == t) +
        "</lun></id>" for t in sorted({VOLUMES[share][0] for share in shares}))
    return f"<config><iscsi><initiator><ver>1</ver>{slots}{more}</initiator></iscsi></config>".encode()


def lived(*shares):
    """A model in which these volumes were added, connected and have a file each."""
    model = Model()
    for share in shares:
        model.answered(Step("add", share))
        model.answered(Step("connect", share))
        model.answered(Step("write", share, "f", 3))
    assert model.saw((settings(*shares), settings(*shares))) == []
    return model


def report(model, files=None, status="Running", conn_set="1", mounted=("a",)):
    """What the appliance says when the volume "a" is all that is stored."""
    slot = "/iscsi/initiator/id:1"
    lines = ["/iscsi/initiator/count=1", "/iscsi/initiator/total_lun_count=1", f"{slot}/target={NAME.format(1)}",
             f"{slot}/ip=10.9.0.2", f"{slot}/port=3260", f"{slot}/conn_set={conn_set}", f"{slot}/status=Connected",
             f"{slot}/lun/id:1/lun=1", f"{slot}/lun/id:1/share=a", f"{slot}/lun/id:1/status={status}",
             f"{WITNESS}  /data/luns/t2-l2", *(f"mount 1 /mnt/VV/{share}" for share in mounted)]
    lines += [f"{digest}  /mnt/VV/a/{name}" for name, digest in (model.files["a"] if files is None else files).items()]
    return Report("\n".join(lines))


def kinds(findings):
    return sorted({text.split(":")[0] for text in findings})


def test_settings_that_nothing_changed_stay_to_the_byte():
    model = lived("a")
    assert model.settings_findings((settings("a"), settings("a")), []) == []
    assert kinds(model.settings_findings((settings("a", more=" "), settings("a")), [])) == ["settings"]


@pytest.mark.parametrize("shares", [("a",), ("a", "b b")])
def test_a_command_under_way_may_have_stored_its_volume_or_not(shares):
    files = settings(*shares), settings("a")
    assert lived("a").settings_findings(files, [Step("add", "b b")]) == []


@pytest.mark.parametrize("torn", [b"", settings("a")[:100], settings("a", "c$d"), settings(), None])
@pytest.mark.parametrize("which", [0, 1])
def test_torn_missing_and_foreign_settings_are_found(torn, which):
    files = [settings("a"), settings("a")]
    files[which] = torn
    assert kinds(lived("a").settings_findings(files, [Step("add", "b b")])) == ["settings"]


def test_what_was_answered_must_be_in_the_settings_and_in_the_copy():
    model = lived("a")
    model.answered(Step("add", "b b"))
    old, new = settings("a"), settings("a", "b b")
    assert model.settings_findings((new, new), []) == []
    assert kinds(model.settings_findings((old, new), [])) == ["settings"]
    assert kinds(model.settings_findings((new, old), [])) == ["settings"]


def test_a_running_volume_with_its_files_is_right():
    model = lived("a")
    assert model.running_findings(report(model), []) == []


@pytest.mark.parametrize("fault", [{"files": {}}, {"files": {"f": "0" * 32}}, {"status": "Offline", "mounted": ()},
                                   {"mounted": ()}, {"conn_set": "0"}, {"status": "Formatting 3%"}])
def test_what_a_cut_must_not_leave_is_found(fault):
    model = lived("a")
    assert model.running_findings(report(model, **fault), [])


def test_a_format_under_way_may_have_taken_the_files_and_the_file_system():
    model = lived("a")
    begun = [Step("format", "a")]
    assert model.running_findings(report(model, files={}), begun) == []
    assert model.running_findings(report(model, status="Create Volume Failed", mounted=()), begun) == []
    assert model.running_findings(report(model, files={}), [Step("connect", "a")])


def test_files_outlive_the_deletion_of_their_volume():
    model = lived("a", "b b")
    model.answered(Step("del_lun", "a"))
    assert model.present == {"b b"}
    assert model.file_findings({"a": {}}, [])


def test_a_log_of_writes_is_replayed_entry_by_entry(tmp_path):
    sector = 512
    entries = [(1, 2, 0, b"A" * 1024), (0, 0, write_log.FLUSH, b""), (2, 1, write_log.DISCARD, b""), (2, 1, 0, b"B" * 512)]
    text = write_log.HEAD.pack(write_log.MAGIC, write_log.VERSION, len(entries), sector).ljust(sector, b"\0")
    for where, count, flags, data in entries:
        text += write_log.ENTRY.pack(where, count, flags, 0).ljust(sector, b"\0") + data
    (tmp_path / "log").write_bytes(text + b"an entry that was not complete")
    (tmp_path / "disk").write_bytes(b"." * 2048)
    with open(tmp_path / "log", "rb") as log, open(tmp_path / "disk", "r+b") as disk:
        found = write_log.entries(log.fileno())
        assert [bool(entry.flags & write_log.FLUSH) for entry in found] == [False, True, False, False]
        for entry in found[:3]:
            write_log.apply(entry, log.fileno(), disk.fileno())
        assert (tmp_path / "disk").read_bytes() == b"." * 512 + b"A" * 1024 + b"." * 512
        write_log.apply(found[3], log.fileno(), disk.fileno())
    assert (tmp_path / "disk").read_bytes() == b"." * 512 + b"A" * 512 + b"B" * 512 + b"." * 512


def test_what_is_no_log_is_refused(tmp_path):
    (tmp_path / "log").write_bytes(b"\0" * 512)
    with open(tmp_path / "log", "rb") as log, pytest.raises(ValueError):
        write_log.entries(log.fileno())
