"""Loop devices as the disks of a box."""

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
