"""Runs a command where broken code harms nobody: python3 fenced.py FOLDER COMMAND... in namespaces of its own.

A breakage may well remove the wrong folder or end the wrong process, and the tests run as root. So all that is mounted
is read-only here, but for FOLDER and for /tmp and /run, which are empty; no process outside is seen."""

import ctypes
import os
import sys

NAMESPACES = ["unshare", "--mount", "--pid", "--ipc", "--fork", "--kill-child", "--mount-proc", sys.executable, "-B", __file__]
MOUNT_SETATTR = 442
AT_FDCWD, AT_RECURSIVE = -100, 0x8000
READ_ONLY = 1


class Attributes(ctypes.Structure):
    _fields_ = [(name, ctypes.c_uint64) for name in ("set", "clear", "propagation", "userns")]


libc = ctypes.CDLL(None, use_errno=True)


def must(result, what):
    if result != 0:
        sys.exit(f"fenced: {what}: {os.strerror(ctypes.get_errno())}")


def attributes(path, flags, **values):
    record = Attributes(**values)
    must(libc.syscall(MOUNT_SETATTR, AT_FDCWD, path.encode(), flags, ctypes.byref(record), ctypes.sizeof(record)), path)


def main():
    folder, command = os.path.realpath(sys.argv[1]), sys.argv[2:]
    bind = 4096
    must(libc.mount(folder.encode(), folder.encode(), None, bind, None), folder)
    attributes("/", AT_RECURSIVE, set=READ_ONLY)
    attributes(folder, 0, clear=READ_ONLY)
    for place, mode in (("/run", "mode=755"), ("/tmp", "mode=1777")):
        must(libc.mount(b"tmpfs", place.encode(), b"tmpfs", 0, mode.encode()), place)
    os.mkdir("/run/lock")
    os.chdir(folder)  # anew: through the mount that may be written
    os.execvp(command[0], command)


if __name__ == "__main__":
    main()
