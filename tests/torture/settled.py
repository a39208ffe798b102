"""Results that are settled as they are although a step failed, each with its reason: a run says 0 and this is missing.

A row: the fault (its road, or more of its text: "ROAD: call 7 (stat /x) fails for ever, errno 5"), the finding that it explains
(expressions, searched), the reason; a fourth expression is of the output, which must tell of it. What stays wrong after the command
was run again is a matter of its own: the second table. Nothing here explains a crash, a hang, lost data, or a touch of a disk that
is not the run's."""

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
    (r"^init", r"daemon: gone",
     "--init is through whatever failed on the way; the next one brings up what is not"),
    (r"^modify", r"tree /iscsi/initiator/id:\d+/chap_",
     "--modify says 0 when its target is known; that the tree fails is told at level 0",
     r"ktreec_\w+"),
    (r"system call \d+ \(write \) fails for ever", r"settings differ$|found: ",
     "nor can anything be told when nothing can be written"),
    (r"^modify_address$", r"tree /iscsi/initiator/id:3/port: 3260 for 3261",
     "what refuses a new address says 0 as well; the printed text tells a refusal from a change",
     r"Can not find \S+ at IP: |is connecting, disconnect it before"),
    (r"^init.*\((sys_hostname|sys_get_mac_addr|.*lan1|.*prefix)|^init.*(memory| for ever)", r"tree /iscsi/initiator/iqn:",
     "a host name or address of the network card that cannot be read is missing from the initiator's name"),
    (r"^init-(alone|empty|flash): .* for ever", r"tree /iscsi/initiator/",
     "--init is through whatever failed on the way; the next one loads what is not loaded"),
    (r"^init-old: .* for ever", r"tree /iscsi/initiator/(ver|id:\d+/lun/)",
     "--init is through whatever failed on the way; the next one converts what is not converted"),
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
    (r"^search", r"found: ",
     "what of a search's results could not be written is told at level 0 and fails no search",
     r"ktreec_(set|del|dump)|cannot"),
    (r"^search_lun(-\w+)?: (memory .*calloc|.*\((fgets |access /dev/|sys_get_|fopen /tmp/remvol_session_get_lun_|iscsiadm -m session -P 3\)))", r"found: ",
     "what a search cannot see of the LUNs in that moment is not in its results"),
    (r"^search$", r"target \d: None for online=0 record=1",
     "a discovery whose command says 0 has found what it has recorded"),
    (r"^search_lun", r"target ",
     "a search that has logged in ends with its own result, whatever the logout's is"),
    (r"^check_share_name: .* for ever", r"result 0 ",
     "a name is free when no LUN is seen to have it, also in a tree that cannot be read; --add looks again"),
)

AFTER = (
    ("", r"tree /iscsi/initiator/id:\d+/lun/id:\d+/format_progress:",
     "the progress of a format that came to an early end stays in the tree; nothing shows it"),
    (r"^del", r"(folder|mount|target) ",
     "a slot is deleted although its volume could not be unmounted or its session closed, and the deletion that is "
     "asked for again finds no slot"),
    (r"^search_lun-.*( is killed| for ever|: memory|: system call|--logout\)|iscsiadm -m session\b|_session\.tmp\)|fgets |str_insert_back_slash |/(mountinfo|targetname)\))",
     r"(target \d|tree /iscsi/initiator/id:\d+/(lun/id:\d+/)?(conn_state|status|dev):)",
     "a search that does not come to its logout or whose logout fails, that does not see the session which it has opened, or "
     "cannot see that nothing is mounted from it leaves the target logged in, and the status says so; nobody can tell any "
     "more who logged in"),
)

def reason(fault, text, output):
    kind, _, rest = text.partition(": ")
    for faults, finding, why, *said in {"success": SUCCESS, "after": AFTER}.get(kind, ()):
        if re.match(finding, rest) and any(re.search(faults, name) for name in (fault.road, str(fault))):
            if not said or re.search(said[0], output):
                return why
    return None
