"""A box with targets: an initiator that keeps state behind `iscsiadm`, disks that can be mounted, stored targets.

    site = Site(box)
    site.offer("iqn.t1", {0: "sdb", 1: "sdc"})   the target shows these disks when somebody logs in
    site.log_in("iqn.t1")                        it is logged in already
    site.disk("sdb", fs="ext4")                  what the platform says of a disk
    site.store("iqn.t1", luns=[("a", 0)])        a target in the tree, its LUNs as (share, number)

A mount is a real one (of a tmpfs with the partition's node as its source), so mount tables, mount points and
disk usage are the kernel's own.
"""

import re
import shlex

INITIATOR = "/iscsi/initiator"

# What a run does, with the slots locked, that stores or deletes one: nobody believes any more what was read before.
SLOTS_MOVE = "truncate -s +1 /run/remvol/slots.lock"
PORTAL = "10.9.0.2"
SHARES = "winshare_reload ; macshare_reload"
SESSIONS = "iscsiadm -m session >/tmp/remvol_session.tmp 2>&1"
DETAILS = "iscsiadm -m session -P3 >/tmp/remvol.tmp 2>&1"

_STATE = "/fake/initiator"

# The initiator: a file in on/ is a session, a folder in offer/ a target with the listings of its session.
_ISCSIADM = r"""
sessions() {
    cd on
    for name in *; do
        [ -e "$name" ] || { echo 'iscsiadm: No active sessions.' >&2; exit 21; }
        cat "../offer/$name/$1"
    done
}
named() {
    while [ "$1" != -T ]; do shift; done
    printf %s "$2"
}
cd /fake/initiator
case "$*" in
"-m session") sessions plain ;;
"-m session -P3" | "-m session -P 3") sessions details ;;
"-m node -u") rm on/* 2>/dev/null || exit 21 ;;
*--login) [ -e "offer/$(named "$@")" ] && : >"on/$(named "$@")" ;;
*--logout) rm "on/$(named "$@")" 2>/dev/null || exit 21 ;;
*"-o delete" | *"-o new" | *"-o update "*) ;;
*) echo "iscsiadm $*: not known here" >&2; exit 7 ;;
esac
"""

_MOUNT = """
case "$*" in *remount*) exit 0 ;; esac
while [ $# -gt 2 ]; do shift; done
mount -t tmpfs "$1" "$2"
"""


class Site:
    def __init__(self, box):
        self.box = box
        self.tree = box.tree
        for folder in ("on", "offer"):
            box.path(_STATE).joinpath(folder).mkdir(parents=True)
        box.write(f"{_STATE}/iscsiadm", _ISCSIADM)
        box.default("iscsiadm", effect=f'sh {_STATE}/iscsiadm "$@"')
        box.default("fuser")
        box.default("mount", effect=_MOUNT)
        box.default("umount", real=True)
        box.default("resize2fs")
        box.default("e2fsck")
        box.default("ps")

    # --- the initiator ---

    def offer(self, name, disks):
        """`disks`: LUN number to kernel name."""
        folder = self.box.path(f"{_STATE}/offer/{name}")
        folder.mkdir(parents=True, exist_ok=True)
        folder.joinpath("plain").write_text(f"tcp: [1] {PORTAL}:3260,1 {name} (non-flash)\n")
        lines = [f"Target: {name} (non-flash)", f"\tCurrent Portal: {PORTAL}:3260,1",
                 "\t\tiSCSI Session State: LOGGED_IN", "\t\tHost Number: 2\tState: running"]
        for number, dev in disks.items():
            lines += [f"\t\tscsi2 Channel 00 Id 0 Lun: {number}",
                      f"\t\t\tAttached scsi disk {dev}\t\tState: running"]
        folder.joinpath("details").write_text("\n".join(lines) + "\n")

    def log_in(self, name):
        self.box.path(f"{_STATE}/on").joinpath(name).touch()

    def logged_in(self, name):
        return self.box.path(f"{_STATE}/on").joinpath(name).exists()

    def fail_login(self, name):
        self.box.fake("iscsiadm", re.compile(f"^-m node -T {re.escape(name)} .*--login$"), stderr="iscsiadm: Could not login\n", status=24)

    # --- disks ---

    def disk(self, dev, *, fs="ext4", size=256 << 20, parts=1):
        """The platform's answers for a disk; fs "": nothing is recognised."""
        names = ",".join(f"{dev}{n}" for n in range(1, parts + 1))
        hook = self.box.hook
        self.box.write(f"/dev/{dev}", "")
        hook("sys_get_disk_space", f"/dev/{dev}", ret=size)
        hook("sys_get_partition_list", f"/dev/{dev}", ret=parts, out=names)
        for n in range(1, parts + 1):
            hook("sys_check_dev", f"/dev/{dev}{n}")
            hook("sys_get_fs_type", f"/dev/{dev}{n}", ret=0 if fs else 1, out=fs)
            hook("sys_check_fs_state", f"/dev/{dev}{n}")
            hook("sys_get_partition_size", f"{dev}{n}", ret=size)
        hook("sys_get_fs_type", "", ret=1)

    def mounted(self, share):
        mounts = self.box.path(f"/proc/{self.tree.daemon.pid}/mounts").read_text()
        return f" /mnt/VV/{share} " in mounts

    def mount(self, dev, path):
        """Mounts a volume as the tool would have."""
        words = " ".join(shlex.quote(w) for w in (f"/dev/{dev}1", path))
        done = self.box.run(["sh", "-c", f"mkdir -p {shlex.quote(path)} && PATH=/bin:/usr/bin mount -t tmpfs {words}"])
        assert done.status == 0, done.stderr

    def mount_anew(self, dev, path):
        """The same from another disk, in place of what is mounted there."""
        assert self.box.run(["sh", "-c", f"PATH=/bin:/usr/bin umount {shlex.quote(path)}"]).status == 0
        self.mount(dev, path)

    # --- stored targets ---

    def store(self, name="iqn.t1", *, slot=1, luns=(), ip=PORTAL, port=3260, chap=0, **settings):
        values = {"target": name, "chap": chap, "chap_name": "", "chap_pwd": "", "ip": ip, "port": port, **settings}
        self.tree.set({f"{INITIATOR}/id:{slot}/{key}": value for key, value in values.items()})
        for number, lun in enumerate(luns, start=1):
            share, lun_number, *more = lun
            fields = {"lun": lun_number, "share": share, "enable": 1, "vol_access_right": 1, **(more[0] if more else {})}
            self.tree.set({f"{INITIATOR}/id:{slot}/lun/id:{number}/{key}": value for key, value in fields.items()})
        if luns:
            self.tree.set(f"{INITIATOR}/id:{slot}/lun/count", len(luns))
        self.tree.set(f"{INITIATOR}/count", slot)

    def debug(self, level):
        self.tree.set(f"{INITIATOR}/dbg", level)

    def target(self, key, slot=1):
        return self.tree.get(f"{INITIATOR}/id:{slot}/{key}")

    def lun(self, key, slot=1, target=1):
        return self.tree.get(f"{INITIATOR}/id:{target}/lun/id:{slot}/{key}")

    def trace(self):
        """Commands, tree writes, deletions and sleeps, in order, with the common beginning of the keys left out."""
        lines = self.box.trace("system", "popen", "sleep", "set", "del", "dump")
        return [line.replace(f" {INITIATOR}/", " ") for line in lines]


def assert_order(trace, *expected):
    """Each of `expected` is in the trace, behind the one before it."""
    rest = iter(enumerate(trace))
    for wanted in expected:
        assert any(line == wanted for _, line in rest), f"'{wanted}' is missing or too early in\n" + "\n".join(trace)


def messages(result):
    """The log lines of a run, without their prefix."""
    return [line.split("): ", 1)[1] for line in result.lines if line.startswith("(") and "): " in line]


def settings(box):
    """The whole tree but the result keys."""
    return {key: value for key, value in box.tree.dump().items() if not key.startswith("/result/")}
