"""Disks beyond 16 TiB: 32 bits are too few for their blocks of 4096 bytes, let alone for sectors and bytes."""

import json
import os
import pathlib

import pytest
from harness.sysaux import MIB, call, image, loop, md_member, mounted, run
from harness.volumes import luns

__all__ = ["loop", "luns"]

TIB = 1 << 40


@pytest.fixture
def memory(tmp_path):
    """A folder for sparse files, which are larger here than ext4 lets a file be."""
    folder = tmp_path / "memory"
    folder.mkdir()
    run("mount", "-t", "tmpfs", "tmpfs", folder)
    yield folder
    run("umount", "-l", folder)


def sectors_of_one_partition(size):
    return size // 512 - 4096  # a mebibyte at either end


def test_the_one_partition_has_all_of_the_disk(memory, loop):
    disk = loop(17 * TIB, folder=memory)
    assert call("disk_space", disk.node) == 17 * TIB
    assert call("create", disk.node) == 0
    assert disk.partitions() == {1: (2048, sectors_of_one_partition(17 * TIB))}
    assert call("partition_size", f"{disk.name}p1") == 17 * TIB - 2 * MIB
    run("sfdisk", "--verify", disk.node)


@pytest.mark.native
def test_the_one_partition_grows_with_the_disk(memory, loop):
    disk = loop(15 * TIB, folder=memory)
    assert call("create", disk.node) == 0
    disk.grow(20 * TIB)
    assert call("disk_space", disk.node) == 20 * TIB
    assert call("expand", disk.node) == 0
    assert disk.partitions() == {1: (2048, sectors_of_one_partition(20 * TIB))}
    assert call("partition_size", f"{disk.name}p1") == 20 * TIB - 2 * MIB
    run("sfdisk", "--verify", disk.node)


def test_what_stands_at_the_end_is_found(memory, loop):
    """The second table of a GPT, a superblock of a RAID, the boot sector's copy of an NTFS."""
    table = loop(17 * TIB, folder=memory)
    assert call("create", table.node) == 0
    table.forget()
    table.write(0, bytes(MIB))
    assert call("partition_list", table.node) == (1, f"{table.name}p1")
    raid, copy = loop(17 * TIB, folder=memory), loop(17 * TIB, folder=memory)
    raid.write(*md_member(17 * TIB, "1.0"))
    copy.write(17 * TIB - 512, image("ntfs")[:512])
    assert call("fs_type", raid.node)[1] == "linux_raid_memb"
    assert call("fs_type", copy.node)[1] == "damaged_ntfs"
    for disk in (table, raid, copy):
        before = disk.digest()
        assert call("create", disk.node) != 0
        assert disk.digest() == before


def test_the_space_of_a_volume_is_all_of_it(memory, loop):
    disk = loop(20 * TIB, folder=memory)
    run("mke2fs", "-q", "-F", "-t", "ext4", "-N", "1024", "-O", "^has_journal,bigalloc", "-C", MIB, disk.node)
    assert call("fs_type", disk.node) == (0, "ext4")
    assert call("check_fs_state", disk.node) == 0
    with mounted(disk.node) as folder:
        for name in ("one", "two"):
            run("fallocate", "-l", 9 * TIB, folder / name)
        result, total, used, available = map(int, call("df_info", folder))
        space = os.statvfs(folder)
        assert result == 0
        assert total == space.f_blocks * space.f_frsize > 19 * TIB
        assert used == (space.f_blocks - space.f_bfree) * space.f_frsize > 18 * TIB
        assert available == space.f_bavail * space.f_frsize


def test_a_disk_becomes_a_volume(memory, luns):
    lun = luns(20 * TIB, folder=memory)
    settings = pathlib.Path("/etc/mke2fs.conf").read_text()
    lazily = settings.replace("[defaults]", "[defaults]\n\tlazy_journal_init = 1", 1)  # or it writes a gibibyte
    lun.box.write("/fake/mke2fs.conf", lazily)
    lun.box.environment["MKE2FS_CONFIG"] = "/fake/mke2fs.conf"
    assert lun.mount().result == 0
    assert lun.key("format_progress") == "100"
    space = os.statvfs(lun.path())
    used, total = (space.f_blocks - space.f_bfree) * space.f_frsize, space.f_blocks * space.f_frsize
    assert total > 19 * TIB
    [shown] = json.loads(lun.box.run(["vvstat", "--json"]).stdout)["volumes"]
    assert (shown["used"], shown["size"]) == (used, total)
