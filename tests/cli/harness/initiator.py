"""A made-up initiator: `iscsiadm` with targets to log in to, and the settings of stored targets.

    initiator = Initiator(box)
    initiator.target("iqn.x:t1", luns={1: "sdb", 2: "sdc"})     # can be logged in to
    initiator.target("iqn.x:t2", refuse=24)                     # refuses the login
    initiator.log_in("iqn.x:t1")                                # a session before the test begins

`iscsiadm` then answers every call of the tool by its state, as 2.1.8 does: exit status 21 without a session,
the listings, login and logout by name. It is made of defaults, so a test's own box.fake("iscsiadm", ...) goes
before it.
"""

import re

HEADER = "iSCSI Transport Class version 2.0-870\nversion 2.1.8\n"
BASE = "iqn.2026-01.org.example:"
T1, T2, T3 = (f"{BASE}t{n}" for n in (1, 2, 3))

NAME = 'while [ $# -gt 0 ]; do [ "$1" = -T ] && name=$2; shift; done; '
NONE = 'if [ ! "$(ls /fake/sessions)" ]; then echo "iscsiadm: No active sessions." >&2; exit 21; fi; '


def block(name, luns, *, state="LOGGED_IN", host=2, mark=" (non-flash)"):
    """The text of one target in the detailed listing. luns: number -> device, None (no disk) or device and
    state of the disk."""
    text = (
        f"Target: {name}{mark}\n\tCurrent Portal: 10.9.0.2:3260,1\n\tPersistent Portal: 10.9.0.2:3260,1\n"
        f"\t\tSID: 1\n\t\tiSCSI Connection State: LOGGED IN\n\t\tiSCSI Session State: {state}\n"
        f"\t\tInternal iscsid Session State: NO CHANGE\n\t\tHost Number: {host}\tState: running\n"
    )
    for lun, disk in luns.items():
        text += f"\t\tscsi{host} Channel 00 Id 0 Lun: {lun}\n"
        if disk is not None:
            device, run_state = disk if isinstance(disk, tuple) else (disk, "running")
            text += f"\t\t\tAttached scsi disk {device}\t\tState: {run_state}\n"
    return text


def session(name, portal="10.9.0.2:3260"):
    """A line of the plain listing."""
    return f"tcp: [1] {portal},1 {name} (non-flash)\n"


class Initiator:
    def __init__(self, box):
        self.box = box
        for folder in ("targets", "refused", "sessions"):
            box.path(f"/fake/{folder}").mkdir()
        for detailed in ("-m session -P3", "-m session -P 3"):
            box.default("iscsiadm", detailed, effect=f"{NONE}printf '{HEADER}'; cat /fake/sessions/*")
        listing = 'for s in /fake/sessions/*; do echo "tcp: [1] 10.9.0.2:3260,1 ${s##*/} (non-flash)"; done'
        box.default("iscsiadm", "-m session", exact=True, effect=NONE + listing)
        box.default("iscsiadm", "-m node -u", effect="rm -f /fake/sessions/*")
        login = (
            'if [ -e "/fake/refused/$name" ]; then exit "$(cat "/fake/refused/$name")"; fi; '
            'cp "/fake/targets/$name" /fake/sessions/ 2>/dev/null || exit 8'
        )
        self._node("--login", login)
        self._node("--logout", '[ -e "/fake/sessions/$name" ] || exit 21; rm "/fake/sessions/$name"')
        for operation in ("delete", "new", "update"):
            self._node(f"-o {operation}", "true")
        box.default("iscsiadm", "-m iface")

    def _node(self, operation, effect):
        expression = re.compile(f"^-m node .*{operation}( |$)")
        self.box.default("iscsiadm", expression, effect=NAME + effect)

    def target(self, name, luns=None, *, refuse=None, **how):
        """Makes a target that can be logged in to; `refuse` is the exit status of a refused login."""
        self.box.write(f"/fake/targets/{name}", block(name, luns or {}, **how))
        refused = self.box.path(f"/fake/refused/{name}")
        if refuse is not None:
            refused.write_text(str(refuse))
        else:
            refused.unlink(missing_ok=True)

    def log_in(self, name):
        self.box.write(f"/fake/sessions/{name}", self.box.path(f"/fake/targets/{name}").read_text())

    def sessions(self):
        return sorted(entry.name for entry in self.box.path("/fake/sessions").iterdir())


def store(box, slot, name, *, luns=(), **values):
    """Stores a target; luns: a list of keys and values a LUN, such as {"lun": 1, "share": "a"}."""
    root = f"/iscsi/initiator/id:{slot}"
    target = {"target": name, "ip": "10.9.0.2", "port": 3260, "chap": 0, "conn_set": 1, **values}
    tree = {f"{root}/{key}": value for key, value in target.items() if value is not None}
    for number, lun in enumerate(luns, 1):
        lun = {"share": f"share{lun['lun']}", "enable": 1, "vol_access_right": 1, **lun}
        tree.update({f"{root}/lun/id:{number}/{key}": value for key, value in lun.items()})
    box.tree.set(tree)
    return root


def record_commands(name, iface="default", portal="10.9.0.2:3260", user=None, secret=None):
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


def login_command(name, iface="default", portal="10.9.0.2:3260"):
    return f"iscsiadm -m node -T {name} -p {portal} -I {iface} --login"


CHECK = "iscsiadm -m session >/tmp/remvol_session.tmp 2>&1"
DEVICES = "iscsiadm -m session -P3 >/tmp/remvol.tmp 2>&1"
RELOAD = "winshare_reload ; macshare_reload"


def logout_command(name):
    return f'iscsiadm -m node -T "{name}" --logout'
