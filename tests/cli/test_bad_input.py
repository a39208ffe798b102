"""Every command with what it cannot mean: it fails, says so in its result, and the settings stay as they were."""

import pytest

from appliance import settings

LONG = "x" * 300
TARGET = {"n": "iqn.t1"}
PORTAL = {"i": "10.9.0.2", "p": "3260"}
# What each command needs at least.
COMMANDS = {
    "add": {**TARGET, **PORTAL, "l": "0", "s": "new"},
    "connect": TARGET,
    "del": TARGET,
    "del_lun": {**TARGET, "l": "1"},
    "format": {**TARGET, "l": "1"},
    "modify": {**TARGET, "c": "0"},
    "modify_address": {**TARGET, **PORTAL},
    "search": PORTAL,
    "search_lun": {**TARGET, **PORTAL, "c": "0"},
    "check_share_name": {"s": "new"},
    "oiscsi_evt_reopen": TARGET,
}
UNKNOWN = ["iqn.t2", "iqn.t", "IQN.T1", "", LONG]
NUMBERS = ["2", "-1", "-2147483648", "2147483647", ""]
PORTS = ["0", "-1", "65536", "2147483647", ""]


def changed(*rows):
    """Of rows (commands, option, values): the command lines that differ in that option alone."""
    return [(command, {**COMMANDS[command], option: value})
            for commands, option, values in rows for command in commands for value in values]


MISSING = [(command, {option: value for option, value in needs.items() if option != left})
           for command, needs in COMMANDS.items() for left in needs if command != "oiscsi_evt_reopen"]
WRONG = changed(
    (["connect", "del", "del_lun", "format", "modify", "modify_address", "oiscsi_evt_reopen"], "n", UNKNOWN),
    (["search_lun"], "n", ["iqn.t2", "", LONG]),  # it need not be stored, but must be offered
    (["add"], "n", [""]),
    (["del_lun", "format"], "l", NUMBERS),
    (["modify_address", "search_lun"], "p", PORTS),  # a port is looked at when it is used
    (["add", "modify_address", "search", "search_lun"], "i", ["", "no.such.host", "10.9.0.2.1", LONG]),
)


@pytest.mark.parametrize("command, options", MISSING + WRONG,
                         ids=lambda value: str(value)[:80] if isinstance(value, dict) else value)
def test_it_fails_and_changes_nothing(site, box, command, options):
    site.store("iqn.t1", luns=[("data", 1)])
    for key, value in {"count": 1, "total_lun_count": 1, "id:1/lun/count": 1}.items():
        box.tree.set(f"/iscsi/initiator/{key}", value)
    before = settings(box)
    done = box.remvol(f"--{command}", *(word for option, value in options.items() for word in (f"-{option}", value)))
    assert done.status == 255
    assert done.stdout.endswith("execute failed.\n")
    # A fault of the command line may be found before the command's result is begun.
    assert box.tree.get(f"/result/{command}") in ("-1", None)
    assert settings(box) == before
    assert box.trace("dump") == []
