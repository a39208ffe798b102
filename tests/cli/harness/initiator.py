"""A made-up initiator: `iscsiadm` with targets to log in to, and the settings of stored targets.

    initiator = Initiator(box)
    initiator.offer("iqn.x:t1", {1: "sdb", 2: "sdc"})     # can be logged in to, and shows these disks then
    initiator.offer("iqn.x:t2", refuse=24)                # refuses the login with this exit status
    initiator.log_in("iqn.x:t1")                          # a session before the test begins
    store(box, "iqn.x:t1", luns=[("share1", 1)])          # a target in the tree, its LUNs as (share, number)

`iscsiadm` then answers every call of the tool by its state, as 2.1.8 does: exit status 21 without a session,
the listings, login and logout by name; discovery and what else a test is about is the test's to say. It is made of
defaults, so a test's own box.fake("iscsiadm", ...) goes before it.
"""

import re

INITIATOR = "/iscsi/initiator"
PORTAL = "10.9.0.2"
HEADER = "iSCSI Transport Class version 2.0-870\nversion 2.1.8\n"
BASE = "iqn.2026-01.org.example:"
T1, T2, T3 = (f"{BASE}t{n}" for n in (1, 2, 3))

_STATE = "/fake/initiator"

# A file in on/ is a session, one in plain/ and details/ what the listings show of it, one in refused/ the exit status
# of a login.
_ISCSIADM = r"""
sessions() {
    cd on
    for name in *; do
        [ -e "$name" ] || { echo 'iscsiadm: No active sessions.' >&2; exit 21; }
        cat "../$1/$name"
    done
}
named() {
    while [ "$1" != -T ]; do shift; done
    printf %s "$2"
}
cd /fake/initiator
case "$*" in
"-m session") sessions plain ;;
"-m session -P3" | "-m session -P 3") [ ! "$(ls on)" ] || cat header; sessions details ;;
"-m node -u") rm on/* 2>/dev/null || exit 21 ;;
*--login)
    name=$(named "$@")
    [ ! -e "refused/$name" ] || { echo 'iscsiadm: Could not login' >&2; exit "$(cat "refused/$name")"; }
    [ -e "details/$name" ] || exit 8
    : >"on/$name" ;;
*--logout)
    name=$(named "$@")
    if [ "$name" ]; then rm "on/$name"; else rm on/*; fi 2>/dev/null || exit 21 ;;  # an empty name is every session's
esac
"""

_ANSWERED = ["-m session( -P ?3)?$", "-m node -u$", "-m node .*--log(in|out)$", "-m node .*-o (delete|new|update)( |$)", "-m iface "]


def block(name, luns, *, state="LOGGED_IN", host=2, mark=" (non-flash)"):
    """The text of one target in the detailed listing. luns: number -> device, None (no disk) or device and
    state of the disk."""
    text = (
        f"Target: {name}{mark}\n\tCurrent Portal: {PORTAL}:3260,1\n\tPersistent Portal: {PORTAL}:3260,1\n"
        f"\t\tSID: 1\n\t\tiSCSI Connection State: LOGGED IN\n\t\tiSCSI Session State: {state}\n"
        f"\t\tInternal iscsid Session State: NO CHANGE\n\t\tHost Number: {host}\tState: running\n"
    )
    for lun, disk in luns.items():
        text += f"\t\tscsi{host} Channel 00 Id 0 Lun: {lun}\n"
        if disk is not None:
            device, run_state = disk if isinstance(disk, tuple) else (disk, "running")
            text += f"\t\t\tAttached scsi disk {device}\t\tState: {run_state}\n"
    return text


def session(name, portal=f"{PORTAL}:3260"):
    """A line of the plain listing."""
    return f"tcp: [1] {portal},1 {name} (non-flash)\n"


class Initiator:
    def __init__(self, box):
        self.box = box
        for folder in ("on", "plain", "details", "refused"):
            box.path(f"{_STATE}/{folder}").mkdir(parents=True)
        box.write(f"{_STATE}/header", HEADER)
        box.write(f"{_STATE}/iscsiadm", _ISCSIADM)
        for words in _ANSWERED:
            box.default("iscsiadm", re.compile(f"^{words}"), effect=f'sh {_STATE}/iscsiadm "$@"')

    def offer(self, name, luns=None, *, refuse=None, **how):
        """Makes a target that can be logged in to, or shows other LUNs from now on; for luns and how see block()."""
        self.box.write(f"{_STATE}/plain/{name}", session(name))
        self.box.write(f"{_STATE}/details/{name}", block(name, luns or {}, **how))
        if refuse is not None:
            self.refuse(name, refuse)

    def refuse(self, name, status=24):
        """From now on a login to the target fails."""
        self.box.write(f"{_STATE}/refused/{name}", str(status))

    def log_in(self, name):
        self.box.write(f"{_STATE}/on/{name}", "")

    def sessions(self):
        return sorted(entry.name for entry in self.box.path(f"{_STATE}/on").iterdir())

    def logged_in(self, name):
        return name in self.sessions()


def store(box, name, *, slot=1, luns=(), **values):
    """Stores a target with its counts. luns: share and number each, and as a third its other keys; a value None leaves
    the key out."""
    root = f"{INITIATOR}/id:{slot}"
    target = {"target": name, "chap": 0, "chap_name": "", "chap_pwd": "", "ip": PORTAL, "port": 3260, **values}
    tree = {f"{root}/{key}": value for key, value in target.items()}
    for number, (share, lun, *more) in enumerate(luns, start=1):
        keys = {"lun": lun, "share": share, "enable": 1, "vol_access_right": 1, **(more[0] if more else {})}
        tree.update({f"{root}/lun/id:{number}/{key}": value for key, value in keys.items()})
    if luns:
        tree[f"{root}/lun/count"] = len(luns)
    tree[f"{INITIATOR}/count"] = slot
    box.tree.set({path: value for path, value in tree.items() if value is not None})


def record_commands(name, iface="default", portal=f"{PORTAL}:3260", user=None, secret=None):
    """The commands that build a target's node record."""
    node = f"iscsiadm -m node -I {iface} -T {name} -p {portal}"
    quoted = f'iscsiadm -m node -I {iface} -T "{name}" -p {portal}'
    auth = "-o update -n node.session.auth"
    if user is None:
        return [f"{node} -o delete", f"{node} -o new", f"{node} {auth}.authmethod -v None"]
    return [
        f"{node} -o delete",
        f"{node} -o new",
        f"{quoted} {auth}.authmethod -v CHAP",
        f'{quoted} {auth}.username -v "{user}"',
        f'{quoted} {auth}.password -v "{secret}"',
    ]


def login_command(name, iface="default", portal=f"{PORTAL}:3260"):
    return f"iscsiadm -m node -T {name} -p {portal} -I {iface} --login"


def logout_command(name):
    return f'iscsiadm -m node -T "{name}" --logout'


SESSIONS = "iscsiadm -m session >/tmp/remvol_session.tmp 2>&1"
DETAILS = "iscsiadm -m session -P3 >/tmp/remvol.tmp 2>&1"
SHARES = "winshare_reload ; macshare_reload"
