"""Disks that somebody else uses: none is partitioned, and none looks empty, whatever is left of its content."""

import struct

import pytest
from harness.sysaux import MIB, call, hfsplus, image, loop, make_ext, md_member, run

__all__ = ["loop"]


def kept(disk, name):
    """The disk is recognised under this name, and not given a table."""
    assert call("fs_type", disk.node) == (0, name)
    before = disk.digest()
    assert call("create", disk.node) != 0
    assert disk.digest() == before and disk.partitions() == {}


# What the programs of each kind wrote, as far as it is recognised by.
@pytest.mark.parametrize("content, name", [
    ("apfs", "apfs"), ("bcache", "bcache"), ("btrfs", "btrfs"), ("erofs", "erofs"), ("exfat", "exfat"), ("f2fs", "f2fs"),
    ("jfs", "jfs"), ("luks1", "crypto_LUKS"), ("luks2", "crypto_LUKS"), ("lvm2", "LVM2_member"), ("nilfs2", "nilfs2"),
    ("ntfs", "ntfs"), ("squashfs", "squashfs"), ("udf", "udf")])
def test_written_by_the_programs_of_its_kind(loop, content, name):
    disk = loop(1024 * MIB)
    disk.write(0, image(content))
    kept(disk, name)


SIZE = 64 * MIB


def raid_09():
    return {SIZE - 65536: struct.pack("<4I", 0xA92B4EFC, 0, 90, 0)}


def intel_raid():
    return {SIZE - 1024: b"Intel Raid ISM Cfg Sig. 1.0.00\0\0"}


def ddf_raid():
    anchor = bytearray(512)
    anchor[0:4] = b"\xde\x11\xde\x11"
    anchor[8:32] = b"Linux-MD12345678abcdefgh"
    anchor[96:104] = (SIZE // 512 - 2).to_bytes(8, "big")
    return {SIZE - 1024: bytes(anchor), SIZE - 512: bytes(anchor)}


def drbd():
    """Sizes, generations, flags and magic; the log of changes, and the bitmap of pieces of 4096 bytes."""
    return {SIZE - 4096: struct.pack(">7Q2I 4iI", 2048, 1, 2, 3, 4, 5, 0, 0, 0x8374026B, 136, -64, 257, -72, 4096)}


def bitlocker():
    head = bytearray(512)
    head[0:11] = b"\xeb\x58\x90-FVE-FS-"
    head[176:184] = (2 * MIB).to_bytes(8, "little")
    return {0: bytes(head), 2 * MIB: b"-FVE-FS-" + struct.pack("<2H", 64, 2)}


@pytest.mark.parametrize("content, name", [
    (raid_09(), "linux_raid_memb"),
    (dict([(0, md_member(SIZE, "1.2")[1][:144] + bytes(368))]), "linux_raid_memb"),  # metadata 1.1
    (intel_raid(), "isw_raid_member"),
    (ddf_raid(), "ddf_raid_member"),
    (drbd(), "drbd"),
    (bitlocker(), "BitLocker"),
    ({0: b"\0\0\0ReFS\0"}, "ReFS"),
    ({MIB: b"\x0d\xd0\x01\xc0"}, "VMFS_volume_mem"),
    ({2 * MIB: b"\x5e\xf1\xab\x2f"}, "VMFS"),
], ids=["raid 0.9", "raid 1.1", "isw", "ddf", "drbd", "bitlocker", "refs", "vmfs member", "vmfs"])
def test_marked_at_its_start_or_at_its_end(loop, content, name):
    disk = loop(SIZE)
    for place, data in content.items():
        disk.write(place, data)
    kept(disk, name)


def test_a_table_whose_first_copy_is_damaged(loop):
    disk = loop()
    disk.sfdisk("label: gpt\nstart=2048,size=40960,type=L\n")
    disk.write(512 + 16, b"\xff")
    assert call("fs_type", disk.node) == (0, "gpt")
    assert call("partition_list", disk.node) == (1, f"{disk.name}p1")
    assert call("create", disk.node) != 0


def test_a_table_of_both_kinds(loop):
    disk = loop()
    disk.sfdisk("label: gpt\nstart=2048,size=40960,type=L\n")
    entry = bytes([0, 0, 2, 0, 0x83, 0, 0, 0]) + struct.pack("<2I", 2048, 40960)
    disk.write(446 + 16, entry)
    before = disk.digest()
    assert call("create", disk.node) != 0
    assert disk.digest() == before
    assert call("partition_list", disk.node)[0] == 1


def test_a_boot_sector_that_no_partitioning_program_wrote(loop):
    """They all write a disk number; without one the two bytes may end anybody's boot sector."""
    disk = loop()
    disk.write(510, b"\x55\xaa")
    kept(disk, "dos")


# --- the first sectors are gone, copies of them further on are left ---


@pytest.mark.parametrize("block, size", [(1024, 64), (2048, 80), (4096, 200)])
def test_an_ext_file_system_without_its_first_superblock(loop, block, size):
    disk = loop(size * MIB)
    run("mke2fs", "-q", "-F", "-t", "ext4", "-b", block, disk.node)
    disk.write(1024 + 56, b"\0\0")
    kept(disk, "damaged_ext")
    disk.write(0, bytes(MIB))
    kept(disk, "damaged_ext")
    run("e2fsck", "-y", "-b", 8193 if block == 1024 else 8 * block, disk.node, check=False)
    assert call("fs_type", disk.node) == (0, "ext4")


def test_an_ext_file_system_without_its_first_superblock_in_a_partition(loop):
    disk = loop()
    assert call("create", disk.node) == 0
    make_ext(disk, disk.part)
    with open(disk.part, "r+b") as part:
        part.write(bytes(MIB))
    assert call("fs_type", disk.part) == (0, "damaged_ext")


def test_an_xfs_without_its_first_superblock(loop):
    for size in (512 * MIB, 512 * MIB + 5 * 4096):
        disk = loop(size)
        run("mkfs.xfs", "-q", disk.node)
        disk.write(0, bytes(512))
        kept(disk, "damaged_xfs")


def test_a_vfat_without_its_first_sector(loop):
    disk = loop()
    run("mkfs.vfat", "-F", "32", disk.node)
    disk.write(0, bytes(512))
    kept(disk, "damaged_vfat")


def test_an_exfat_without_its_first_sector(loop):
    disk = loop()
    disk.write(0, image("exfat"))
    disk.write(0, bytes(512))
    kept(disk, "damaged_exfat")


def test_an_ntfs_without_its_first_sector(loop):
    disk = loop()
    disk.write(SIZE - 512, image("ntfs")[:512])
    kept(disk, "damaged_ntfs")


def test_an_hfsplus_without_its_first_header(loop):
    disk = loop()
    disk.write(SIZE - 1024, hfsplus()[1])
    kept(disk, "damaged_hfs")


def test_a_btrfs_without_its_first_superblock(loop):
    disk = loop(128 * MIB)
    disk.write(64 * MIB, image("btrfs")[64 * 1024:68 * 1024])
    kept(disk, "damaged_btrfs")


def test_a_copy_that_outlived_a_format_hides_nothing(loop):
    disk = loop()
    disk.write(SIZE - 512, image("ntfs")[:512])
    run("mke2fs", "-q", "-F", "-t", "ext4", "-b", "4096", disk.node)
    assert call("fs_type", disk.node) == (0, "ext4")


@pytest.mark.parametrize("place, data", [(8193 * 1024 + 56, b"\x53\xef"), (SIZE - 512, b"NTFS    "), (SIZE // 4, b"XFS")])
def test_a_chance_likeness_is_no_copy(loop, place, data):
    disk = loop()
    disk.write(place, data)
    assert call("fs_type", disk.node) == 1
    assert call("create", disk.node) == 0
