"""Results that are settled as they are although a step failed, each with its reason: a run says 0 and this is missing.

A row: the roads, the finding that it explains (expressions, searched), the reason. What stays wrong after the command
was run again is a matter of its own: the second table. Nothing here explains a crash, a hang, lost data, or a touch of
a disk that is not the run's."""

import re

# What the next --status or --connect writes again. Its writers' results are not looked at by the commands.
SHOWN = r"status|size|conn_state|dev|format_state|format_progress|volume_state|mnt|mnt_dev|fs_type|vol_access_right"
COUNTS = r"count|total_lun_count"
BRINGS_UP = r"^(connect|connect-again|modify|init|recover)$"

SUCCESS = (
    ("", rf"tree /iscsi/initiator/id:\d+/(lun/id:\d+/)?({SHOWN}):",
     "a failed write of a state or a status text fails no command; the next --status writes it again"),
    ("", rf"tree /iscsi/initiator/(id:\d+/lun/)?({COUNTS}):",
     "a failed write of a count fails no command; the next change of the targets or --status writes it again"),
    ("", r"tree /iscsi/initiator/id:\d+/conn_set:",
     "whether the wish to be connected was stored is not looked at"),
    ("", r"settings differ \(said\)",
     "the result of the dump is not looked at; that it failed is told at level 0"),
    (BRINGS_UP, r"(disk|folder|mount) ",
     "a volume that cannot be mounted is told by its volume state and fails no command that brings a target up"),
    (r"^(modify|init|recover)$", r"target \d",
     "a login that fails is told by the connect state, and the command has done its work"),
    (r"^init$", r"tree /iscsi/initiator/(ver|iqn):",
     "--init is through whatever failed on the way"),
    (r"^add$", r"target 4:",
     "the node record is made anew by every login, so a failure to make it fails no --add"),
    (r"^add-connected$", r"(disk|folder|mount) ",
     "a LUN that shows no usable disk, cannot be read back, or whose mount does not take hold stays added, and is "
     "mounted by the next --connect"),
    (r"^recover$", r"tree /temp/remvol/recover/queue/",
     "a run that does not get the recover lock, whatever the reason, has put its target into the queue; the next "
     "recovery takes it from there"),
    (r"^format$", r"(folder|mount|disk) ",
     "a mount that never takes hold after the format is told by volume state 3 alone"),
    (r"^(disconnect|disconnect-all|del|del_lun)$", r"(folder|mount|target) ",
     "a failure to unmount or to log out stops neither a --disconnect nor a deletion"),
)

AFTER = (
    ("", r"tree /iscsi/initiator/id:\d+/lun/id:\d+/format_progress:",
     "the progress of a format that came to an early end stays in the tree; nothing shows it"),
    (r"^(del|del_lun)$", r"(folder|mount|target|disk) ",
     "a slot is deleted although its volume could not be unmounted or its session closed, and the deletion that is "
     "asked for again finds no slot"),
)

def reason(fault, text):
    kind, _, rest = text.partition(": ")
    table = {"success": SUCCESS, "after": AFTER}.get(kind, ())
    for roads, finding, why in table:
        if re.search(roads, fault.road) and re.match(finding, rest):
            return why
    return None
