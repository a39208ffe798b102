"""Calls of the platform libraries on real loop devices: what the test_sysaux files share."""

import hashlib
import json
import lzma
import os
import pathlib
import subprocess
import tempfile

import pytest

REPOSITORY = pathlib.Path(__file__).resolve().parents[3]
CALL = (REPOSITORY / os.environ.get("REMVOL_BUILD", "build/release")).resolve() / "tests/harness/sysaux_call"
MIB = 1 << 20
# The leak sanitizer cannot work in a traced process.
TRACED = {**os.environ, "ASAN_OPTIONS": "detect_leaks=0"}


def run(*argv, check=True, **more):
    done = subprocess.run([str(a) for a in argv], capture_output=True, text=True, timeout=60, **more)
    if check and done.returncode != 0:
        raise AssertionError(f"{argv} exits {done.returncode}: {done.stdout}{done.stderr}")
    return done.stdout


def call(name, argument, tracer=()):
    """The library's answer: a number, or a number and words."""
    done = subprocess.run(
        [*tracer, CALL, name, str(argument)],
        capture_output=True, text=True, timeout=60, env=TRACED if tracer else None,
    )
    assert done.returncode == 0, f"{name} {argument}: exits {done.returncode}: {done.stderr}"
    number, *words = done.stdout.split()
    return (int(number), *words) if words else int(number)


class Loop:
    """A sparse file as a disk: `node`, its kernel `name`, its backing `file`."""

    def __init__(self, file, size, *options):
        self.file = pathlib.Path(file)
        self.resize(size)
        self.node = run("losetup", "--show", *options, "-f", self.file).strip()
        self.name = self.node.removeprefix("/dev/")
        self.part = self.node + "p1"
        # Detached by the kernel when the last user is gone, so nothing is left behind by a test that is killed.
        self.held = os.open(self.node, os.O_RDONLY | os.O_CLOEXEC)
        run("losetup", "-d", self.node)
        self.forget()

    def resize(self, size):
        with open(self.file, "ab") as file:
            file.truncate(size)

    def grow(self, size):
        self.resize(size)
        run("losetup", "-c", self.node)

    def partitions(self):
        """{number: (start, sectors)} as the kernel has them."""
        found = {}
        for file in pathlib.Path(f"/sys/block/{self.name}").glob("*/partition"):
            start, size = (int((file.parent / field).read_text()) for field in ("start", "size"))
            found[int(file.read_text())] = (start, size)
        return found

    def forget(self):
        """Makes the kernel forget the partitions, as if it had never read the table."""
        if self.partitions():
            run("partx", "-d", self.node)

    def table(self):
        """The partition table as sfdisk reads it."""
        return json.loads(run("sfdisk", "--json", self.node))["partitiontable"]

    def sfdisk(self, script):
        run("sfdisk", "-q", "--no-reread", "--no-tell-kernel", self.node, input=script)

    def write(self, offset, data):
        with open(self.node, "r+b", buffering=0) as device:
            device.seek(offset)
            device.write(data)
            os.fsync(device.fileno())

    def wipe_ends(self):
        """Zeroes the first and the last mebibyte, where partition tables are."""
        self.write(0, bytes(MIB))
        self.write(os.stat(self.file).st_size - MIB, bytes(MIB))

    def digest(self):
        """Of all that is on the disk; sparse parts cost nothing."""
        run("sync", self.node)
        whole = hashlib.sha256()
        with open(self.file, "rb") as file:
            end = os.fstat(file.fileno()).st_size
            at = 0
            while at < end:
                try:
                    at = os.lseek(file.fileno(), at, os.SEEK_DATA)
                except OSError:
                    break
                stop = os.lseek(file.fileno(), at, os.SEEK_HOLE)
                while at < stop:
                    chunk = os.pread(file.fileno(), min(stop - at, 4096), at)
                    if chunk.strip(b"\0"):
                        whole.update(b"%d:" % at + chunk)
                    at += len(chunk)
        return whole.hexdigest()

    def close(self):
        self.forget()
        run("blockdev", "--setrw", self.node, check=False)  # the next user of the device would inherit it
        os.close(self.held)


class mounted:
    """A device mounted for a while; gives the folder. It is mounted in a namespace of its own: the boxes of tests
    that run at the same time take copies of all mounts, and would keep the device busy."""

    def __init__(self, node):
        self.node = node

    def __enter__(self):
        folder = tempfile.mkdtemp()
        self.holder = subprocess.Popen(
            ["unshare", "--mount", "sh", "-c", 'mount "$0" "$1" && echo ready && read end; umount "$1"',
             self.node, folder],
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True,
        )
        assert self.holder.stdout.readline() == "ready\n"
        self.folder = folder
        return pathlib.Path(f"/proc/{self.holder.pid}/root{folder}")

    def __exit__(self, *_):
        self.holder.communicate(timeout=60)
        assert self.holder.returncode == 0
        os.rmdir(self.folder)


@pytest.fixture
def loop(tmp_path):
    """Makes loop devices: loop(size, *options of losetup)."""
    made = []

    def make(size=64 * MIB, *options, folder=tmp_path):
        made.append(Loop(pathlib.Path(folder) / f"disk{len(made)}", size, *options))
        return made[-1]

    yield make
    for disk in made:
        disk.close()


def image(name):
    return lzma.decompress((pathlib.Path(__file__).parents[1] / "images" / f"{name}.img.xz").read_bytes())


def hfsplus():
    """The volume header that the recognition looks at: signature, version 4, blocks of 4096 bytes."""
    header = bytearray(512)
    header[0:4] = b"H+\0\4"
    header[40:44] = (4096).to_bytes(4, "big")
    return 1024, bytes(header)


def md_member(size, version):
    """A member of a Linux RAID; with metadata 1.2 the superblock is near the start, with 1.0 near the end."""
    offset = 4096 if version == "1.2" else (size - 8192) & ~4095
    block = bytearray(512)
    block[0:8] = (0xA92B4EFC).to_bytes(4, "little") + (1).to_bytes(4, "little")
    block[144:152] = (offset // 512).to_bytes(8, "little")
    return offset, bytes(block)


def make_ext(disk, node=None, kind="ext4"):
    run("mke2fs", "-q", "-F", "-t", kind, node or disk.node)


def make_ambivalent(disk, node=None):
    """A squashfs in the first kibibyte, which ext4 leaves alone: either may be what counts."""
    make_ext(disk, node)
    with open(node or disk.node, "r+b", buffering=0) as device:
        device.write(squashfs_head())
        os.fsync(device.fileno())


def squashfs_head():
    head = bytearray(96)
    head[0:4] = b"hsqs"
    head[12:16] = (131072).to_bytes(4, "little")
    head[28:32] = (4).to_bytes(2, "little") + (0).to_bytes(2, "little")
    return bytes(head)


def read_at(disk, offset, size):
    with open(disk.node, "rb", buffering=0) as device:
        device.seek(offset)
        return device.read(size)


# --- faults ---


def calls_of(name, argument, path, syscalls):
    """The system calls of these kinds that the call makes on that path, as text."""
    with tempfile.NamedTemporaryFile("r") as trace:
        run("strace", "-f", "-qq", "-o", trace.name, "-P", path, "-e", f"trace={syscalls}", CALL, name, argument, env=TRACED)
        return [line for line in trace if "(" in line]


def under_fault(name, argument, path, syscalls, fault, when):
    """Runs the call with one of these system calls failing (or killing it); gives its exit status and words."""
    done = subprocess.run(
        ["strace", "-f", "-qq", "-o", "/dev/null", "-P", str(path), "-e", f"trace={syscalls}", "-e", f"inject={syscalls}:{fault}:when={when}", CALL, name, str(argument)],
        capture_output=True, text=True, timeout=60, env=TRACED,
    )
    return done.returncode, done.stdout.split()

