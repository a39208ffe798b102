"""Volumes on real disks: a box whose /dev is the machine's, loop devices as LUNs, every disk command the real one.

    lun = luns(300 << 20)                a LUN of the target in slot 1, in the next free LUN slot
    lun.mount()                          Target_mount of it; gives the run's Result with .result, its result code
    lun.mount(force=1, share=1)
    lun.unmount(), lun.call("ftp_path")  other operations of the driver on this LUN
    lun.key("volume_state")              its value in the tree
    lun.disk                             the loop device (harness.sysaux.Loop)
    lun.write_file(name, data), lun.read_file(name)     in the mounted volume, seen from inside the box
    lun.mounted()                        whether its mount point is a mount
"""

import os
import pathlib
import re
import time

import pytest

from .sysaux import Loop

REAL_COMMANDS = "mount umount fuser dd mke2fs resize2fs e2fsck ps".split()
SLOT = "/iscsi/initiator/id:1"


class Lun:
    def __init__(self, box, disk, slot, share):
        self.box, self.disk, self.slot, self.share = box, disk, slot, share
        self.mount_point = f"/mnt/VV/{share}"
        key = f"{SLOT}/lun/id:{slot}"
        box.tree.set({f"{key}/lun": slot, f"{key}/share": share, f"{key}/enable": 1, f"{key}/dev": disk.name})

    def call(self, operation, *more):
        return drive(self.box, operation, 1, self.slot, *more)

    def mount(self, force=0, share=0):
        return self.call("mount", force, share)

    def unmount(self):
        return self.call("unmount")

    def key(self, name):
        return self.box.tree.get(f"{SLOT}/lun/id:{self.slot}/{name}")

    def path(self, name=""):
        return self.box.path(self.mount_point) / name

    def write_file(self, name, data):
        self.path(name).write_bytes(data)

    def read_file(self, name):
        return self.path(name).read_bytes()

    def mounts(self):
        """The mount points of the disk and its partitions, in the kernel's order."""
        table = pathlib.Path(f"/proc/{self.box.pid}/mounts").read_bytes()
        lines = os.fsdecode(table).split("\n")  # other ends of lines are characters of a path
        mine = re.compile(re.escape(self.disk.node) + r"(p\d+)? ")
        paths = [line.split(" ")[1] for line in lines if mine.match(line)]
        return [re.sub(r"\\(\d{3})", lambda m: chr(int(m[1], 8)), path) for path in paths]

    def mounted(self):
        return self.mount_point in self.mounts()


def drive(box, *argv):
    """Runs the driver for an operation that is not one LUN's."""
    return with_result(box.run([str(box.tools / "volume_driver"), *map(str, argv)]))


def with_result(done):
    found = re.findall(r"result = (-?\d+)$", done.stdout, re.M)  # commands print on the same line
    done.result = int(found[-1]) if found else None
    return done


@pytest.fixture
def luns(box, tmp_path):
    assert box.run(["/usr/bin/mount", "-t", "devtmpfs", "none", "/dev"]).status == 0
    for command in REAL_COMMANDS:
        box.default(command, real=True)
    box.tree.set(f"{SLOT}/target", "iqn.t1")
    made = []

    def make(size, share=None, *options, folder=tmp_path):
        slot = len(made) + 1
        disk = Loop(folder / f"disk{slot}", size, *options)
        made.append(Lun(box, disk, slot, share or f"share{slot}"))
        return made[-1]

    yield make
    take_down(box, made)


def take_down(box, made):
    """The box's processes go first, then its mounts, then the devices."""
    box.run(["/bin/sh", "-c", "kill -9 -1"])
    for lun in made:
        for path in reversed(lun.mounts()):
            box.run(["/usr/bin/umount", "-l", "--", path])
        end = time.monotonic() + 10
        while True:  # a file system goes away a moment after its last user
            try:
                lun.disk.forget()
                break
            except AssertionError:
                if time.monotonic() > end:
                    raise
                time.sleep(0.01)
        lun.disk.close()
