"""The library loads what disks need from beside itself, wherever it lies."""

import os
import shutil
import subprocess

import pytest
from harness.sysaux import CALL, TRACED, loop, make_ext, run

__all__ = ["loop"]

LIBRARY = CALL.parents[2] / "lib"


def moved(folder, *names):
    """A copy of the library and these modules; gives an answer of a call with it."""
    folder.mkdir(exist_ok=True)
    for name in ("libsysaux.so", *names):
        shutil.copy(LIBRARY / name, folder)

    def call(name, argument, **environment):
        return run(CALL, name, argument, env={**os.environ, "LD_LIBRARY_PATH": str(folder), **environment})

    return call


def test_the_modules_are_those_beside_the_library(loop, tmp_path):
    disk = loop()
    make_ext(disk)
    folder = tmp_path / "a folder"
    call = moved(folder, "libsysaux_probe.so", "libsysaux_disk.so")
    assert call("fs_type", disk.node) == "0 ext4\n"
    assert call("check_fs_state", disk.node) == "0\n"
    assert call("create", disk.node) == "-1\n"
    traced = subprocess.run(
        ["strace", "-f", "-e", "trace=open,openat", CALL, "fs_type", disk.node],
        capture_output=True, text=True, env={**TRACED, "LD_LIBRARY_PATH": str(folder)},
    ).stderr
    opened = [line for line in traced.splitlines() if "libsysaux_probe.so" in line]
    assert opened and all(str(folder) in line for line in opened)
    assert "libfdisk" not in traced and "libext2fs" not in traced


@pytest.mark.parametrize(
    "name, answer",
    [("fs_type", "-1 \n"), ("partition_list", "-1 \n"), ("create", "-1\n"), ("expand", "-1\n"), ("check_fs_state", "0\n")],
)
def test_without_its_modules_nothing_is_known_and_nothing_is_done(loop, tmp_path, name, answer):
    disk = loop()
    before = disk.digest()
    assert moved(tmp_path / "alone")(name, disk.node) == answer
    assert disk.digest() == before


@pytest.mark.parametrize("node", ["", "/dev/none", "/dev/null", "/tmp"])
def test_where_no_disk_is_nothing_is_loaded_to_tell(node):
    traced = subprocess.run(["strace", "-f", "-e", "trace=open,openat", CALL, "fs_type", node],
                            capture_output=True, text=True, env=TRACED)
    assert traced.stdout == "-1 \n"
    assert "libsysaux_probe.so" not in traced.stderr and "libblkid" not in traced.stderr
