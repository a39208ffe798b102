"""Results that are settled as they are although a step failed, each with its reason: a run says 0 and this is missing.

A row: the roads ("ROAD for ever" is one where that fault stayed), the finding that it explains (expressions, searched), the
reason. What stays wrong after the command was run again is a matter of its own: the second table. Nothing here explains a
crash, a hang, lost data, or a touch of a disk that is not the run's."""

import re

# What the next --status or --connect writes again. Its writers' results are not looked at by the commands.
SHOWN = r"status|size|conn_state|dev|format_state|format_progress|volume_state|mnt|mnt_dev|fs_type|vol_access_right"
COUNTS = r"count|total_lun_count"
BRINGS_UP = r"^(connect|modify|init|recover)"

SUCCESS = (
    ("", rf"tree /iscsi/initiator/id:\d+/(lun/id:\d+/)?({SHOWN}):",
     "a failed write of a state or a status text fails no command; the next --status writes it again"),
    ("", rf"tree /iscsi/initiator/(id:\d+/lun/)?({COUNTS}):",
     "a failed write of a count fails no command; the next change of the targets or --status writes it again"),
    (rf"{BRINGS_UP}|^disconnect", r"tree /iscsi/initiator/id:\d+/conn_set:",
     "whether the wish to be connected was stored is not looked at"),
    ("", r"settings differ \(said\)",
     "the result of the dump is not looked at; that it failed is told at level 0"),
    (BRINGS_UP, r"(disk|folder|mount) ",
     "a volume that cannot be mounted is told by its volume state and fails no command that brings a target up"),
    (r"^(modify|init|recover)", r"target \d",
     "a login that fails is told by the connect state, and the command has done its work"),
    (r"^init", r"(daemon: gone|tree /iscsi/initiator/)",
     "--init is through whatever failed on the way; the next one brings up what is not"),
    (r"^add(-first|-second)?$", r"target \d:",
     "the node record is made anew by every login, so a failure to make it fails no --add"),
    (r"^add-connected$", r"(disk|folder|mount) ",
     "a LUN that shows no usable disk, cannot be read back, or whose mount does not take hold stays added, and is "
     "mounted by the next --connect"),
    (r"^recover", r"tree /temp/remvol/recover/queue/",
     "a run that does not get the recover lock, whatever the reason, has put its target into the queue; the next "
     "recovery takes it from there"),
    (r"^format$", r"(folder|mount) ",
     "a mount that never takes hold after the format is told by volume state 3 alone"),
    (r"^(disconnect|del|deinit|system_off)", r"(folder|mount|target) ",
     "a failure to unmount or to log out stops neither a --disconnect nor a deletion nor a shutdown"),
    (r"^(deinit|system_off)$", r"daemon: there",
     "a failure to end the tree's daemon fails no shutdown"),
    (r"^(search|search_lun)", r"found: ",
     "what of a search's results could not be written is told at level 0 and fails no search; its end is in them"),
    (r"^search$", r"target \d: None for online=0 record=1",
     "a discovery whose command says 0 has found what it has recorded"),
    (r"^search_lun", r"target ",
     "a search that has logged in ends with its own result, whatever the logout's is"),
    (r"^check_share_name for ever$", r"result 0 ",
     "a name is free when no LUN is seen to have it, also in a tree that cannot be read; --add looks again"),
)

AFTER = (
    ("", r"tree /iscsi/initiator/id:\d+/lun/id:\d+/format_progress:",
     "the progress of a format that came to an early end stays in the tree; nothing shows it"),
    (r"^del", r"(folder|mount|target) ",
     "a slot is deleted although its volume could not be unmounted or its session closed, and the deletion that is "
     "asked for again finds no slot"),
    (r"^search_lun-", r"(target \d|tree /iscsi/initiator/id:\d+/(lun/id:\d+/)?(conn_state|status|dev):)",
     "a search that ends before its logout leaves the target logged in, and the status says so; nobody can tell any "
     "more who logged in"),
)

def reason(fault, text):
    kind, _, rest = text.partition(": ")
    table = {"success": SUCCESS, "after": AFTER}.get(kind, ())
    for roads, finding, why in table:
        of_road = re.search(roads, fault.road) or (fault.forever and re.search(roads, f"{fault.road} for ever"))
        if of_road and re.match(finding, rest):
            return why
    return None
