"""A box with targets: a made-up initiator (harness/initiator.py), disks that can be mounted, stored targets.

    site = Site(box)                             an Initiator: offer(), log_in() and so on are its own
    site.disk("sdb", fs="ext4")                  what the platform says of a disk
    site.store("iqn.t1", luns=[("a", 0)])        a target in the tree, its LUNs as (share, number)

A mount is a real one (of a tmpfs with the partition's node as its source), so mount tables, mount points and
disk usage are the kernel's own.
"""

import shlex

from harness.initiator import INITIATOR, Initiator, store

# What a run does, with the slots locked, that stores or deletes one: nobody believes any more what was read before.
SLOTS_MOVE = "truncate -s +1 /run/remvol/slots.lock"

_MOUNT = """
case "$*" in *remount*) exit 0 ;; esac
while [ $# -gt 2 ]; do shift; done
mount -t tmpfs "$1" "$2"
"""


class Site(Initiator):
    def __init__(self, box):
        super().__init__(box)
        self.tree = box.tree
        box.default("fuser")
        box.default("mount", effect=_MOUNT)
        box.default("umount", real=True)
        box.default("resize2fs")
        box.default("e2fsck")
        box.default("ps")

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

    def store(self, name="iqn.t1", **settings):
        store(self.box, name, **settings)

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


# Rows of a table of cases carry their set-up as a list of these: each is done with the site.


def fake(*arguments, **options):
    return lambda site: site.box.fake(*arguments, **options)


def hook(*arguments, **options):
    return lambda site: site.box.hook(*arguments, **options)


def offer(*arguments, **options):
    return lambda site: site.offer(*arguments, **options)


def set_up(site, steps):
    for step in steps:
        step(site)


def assert_order(trace, *expected):
    """Each of `expected` is in the trace, behind the one before it."""
    rest = iter(enumerate(trace))
    for wanted in expected:
        assert any(line == wanted for _, line in rest), f"'{wanted}' is missing or too early in\n" + "\n".join(trace)


def settings(box):
    """The whole tree but the result keys."""
    return {key: value for key, value in box.tree.dump().items() if not key.startswith("/result/")}
