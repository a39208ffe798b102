"""Loop devices as the disks of a box, and whose disk its /sys/block says one is."""

import fcntl
import os
import stat

# linux/loop.h
LOOP_CTL_GET_FREE, LOOP_SET_FD, LOOP_CLR_FD = 0x4C82, 0x4C00, 0x4C01


def attach(box, name, size, sysfs):
    backing = box.path(f"/tmp/{name}.img")
    with open(backing, "wb") as file:
        file.truncate(size)
    loop, node = _free_loop(backing)
    device = os.stat(node).st_rdev
    os.mknod(box.path(f"/dev/{name}"), stat.S_IFBLK | 0o660, device)
    if sysfs:
        box.write(f"/sys/block/{name}/dev", f"{os.major(device)}:{os.minor(device)}\n")
        box.write(f"/sys/block/{name}/size", f"{size // 512}\n")
    return backing, loop


def lead_to_session(box, name, target, lun, session):
    """The `device` link that the kernel gives the disk of an iSCSI session."""
    root = f"/fake/devices/platform/host{session + 1}/session{session}"
    box.write(f"{root}/iscsi_session/session{session}/targetname", f"{target}\n")
    _link_device(box, name, f"{root}/target{session + 1}:0:0/{session + 1}:0:0:{lun}")


def lead_to_controller(box, name):
    """The `device` link of a disk of the machine."""
    _link_device(box, name, "/fake/devices/pci0000:00/0000:00:1f.2/ata1/host0/target0:0:0/0:0:0:0")


def _link_device(box, name, device):
    box.path(device).mkdir(parents=True, exist_ok=True)
    link = box.path(f"/sys/block/{name}/device")
    link.parent.mkdir(parents=True, exist_ok=True)
    link.unlink(missing_ok=True)
    link.symlink_to(device)


def _free_loop(backing):
    """Another test may take the free device first: then the next one is asked for."""
    with open("/dev/loop-control", "rb") as control:
        for _ in range(100):
            number = fcntl.ioctl(control, LOOP_CTL_GET_FREE)
            node = f"/dev/loop{number}"
            with open(node, "r+b", buffering=0) as device, open(backing, "r+b") as file:
                try:
                    fcntl.ioctl(device, LOOP_SET_FD, file.fileno())
                    return number, node
                except OSError:
                    continue
    raise RuntimeError("no free loop device")


def detach(number):
    """A device that is still mounted in the box goes with the mount."""
    with open(f"/dev/loop{number}", "rb") as device:
        fcntl.ioctl(device, LOOP_CLR_FD)
