"""What the platform recognises on a device, and what it never takes for an empty one."""

import os
import struct
import subprocess

import pytest
from harness.sysaux import (
    CALL, MIB, call, calls_of, hfsplus, image, loop, make_ambivalent, make_ext, md_member, mounted, run, under_fault,
)

__all__ = ["loop"]


@pytest.mark.parametrize("kind", ["ext2", "ext3", "ext4"])
def test_ext_file_systems_have_their_names(loop, kind):
    disk = loop()
    make_ext(disk, kind=kind)
    assert call("fs_type", disk.node) == (0, kind)


def test_vfat_and_xfs_have_their_names(loop):
    fat, xfs = loop(), loop(512 * MIB)
    run("mkfs.vfat", fat.node)
    run("mkfs.xfs", "-q", xfs.node)
    assert call("fs_type", fat.node) == (0, "vfat")
    assert call("fs_type", xfs.node) == (0, "xfs")


# The images are the first sectors that mkntfs, pvcreate and cryptsetup luksFormat wrote.
@pytest.mark.parametrize("name, found", [("ntfs", "ntfs"), ("lvm2", "LVM2_member"), ("luks2", "crypto_LUKS")])
def test_recorded_signatures_have_their_names(loop, name, found):
    disk = loop(8 * MIB)
    disk.write(0, image(name))
    assert call("fs_type", disk.node) == (0, found)


def test_hfsplus_has_its_name(loop):
    disk = loop()
    disk.write(*hfsplus())
    assert call("fs_type", disk.node) == (0, "hfsplus")


def test_swap_has_its_name(loop):
    disk = loop()
    run("mkswap", disk.node)
    assert call("fs_type", disk.node) == (0, "swap")


@pytest.mark.parametrize("version", ["1.0", "1.2"])
def test_a_long_name_is_cut_to_15_characters(loop, version):
    disk = loop()
    disk.write(*md_member(64 * MIB, version))
    assert call("fs_type", disk.node) == (0, "linux_raid_memb")


@pytest.mark.parametrize("label", ["dos", "gpt"])
def test_a_partition_table_counts_as_recognised(loop, label):
    disk = loop()
    disk.sfdisk(f"label: {label}\n,,L\n")
    assert call("fs_type", disk.node) == (0, label)


def test_an_empty_device_is_told_from_one_that_cannot_be_read(loop, tmp_path):
    assert call("fs_type", loop().node) == 1
    assert call("fs_type", "/dev/no_such_node") == -1
    assert call("fs_type", tmp_path) == -1
    assert call("fs_type", "/dev/null") == -1


ZFS_AT_THE_START = [0, 256 * 1024]
ZFS_AT_THE_END = [64 * MIB - 512 * 1024, 64 * MIB - 256 * 1024]


def zfs_pair(name, kind, value):
    padded = name + bytes(-len(name) % 4)
    size = 12 + len(padded) + 8 + len(value)
    return struct.pack(">3I", size, size, len(name)) + padded + struct.pack(">2I", kind, 1) + value


def zfs_config():
    """The names and values of a label: encoding and byte order, a version and flags, the pairs, and an empty one."""
    number, text = 8, 9
    pairs = [
        zfs_pair(b"version", number, struct.pack(">Q", 5000)),
        zfs_pair(b"name", text, struct.pack(">I", 4) + b"tank"),
        zfs_pair(b"state", number, bytes(8)),
        zfs_pair(b"txg", number, struct.pack(">Q", 4)),
        zfs_pair(b"pool_guid", number, struct.pack(">Q", 0x1234567890)),
        zfs_pair(b"guid", number, struct.pack(">Q", 0x9876543210)),
    ]
    return b"\1\1\0\0" + struct.pack(">2I", 0, 1) + b"".join(pairs) + bytes(8)


def write_zfs_uberblocks(disk, *places, order="<"):
    """The rings of uberblocks of the labels at these places, in the byte order of the machine that wrote them."""
    for place in places:
        for i in range(8):
            uberblock = struct.pack(f"{order}QQQQQ", 0x00BAB10C, 5000, i + 1, 1, 1700000000)
            disk.write(place + 128 * 1024 + i * 1024, uberblock)


def write_zfs_labels(disk, *places):
    """libblkid 2.38 goes by the uberblocks of a label, 2.41 by its names and values."""
    write_zfs_uberblocks(disk, *places)
    for place in places:
        disk.write(place + 16 * 1024, zfs_config())


@pytest.mark.parametrize("places", [ZFS_AT_THE_START, ZFS_AT_THE_END])
def test_zfs_labels_at_either_end_are_recognised(loop, places):
    disk = loop()
    write_zfs_labels(disk, *places)
    assert call("fs_type", disk.node) == (0, "zfs_member")


@pytest.mark.parametrize("order", ["<", ">"])
@pytest.mark.parametrize("places", [ZFS_AT_THE_START[1:], ZFS_AT_THE_END[1:]])
def test_zfs_labels_without_their_names_and_values_are_not_empty(loop, places, order):
    disk = loop(64 * MIB + 4096)  # the last label ends at a whole quarter of a mebibyte
    write_zfs_uberblocks(disk, *places, order=order)
    assert call("fs_type", disk.node) in [(0, "zfs_member"), (0, "damaged_zfs")]


def test_zfs_labels_that_outlived_a_format_hide_nothing(loop):
    disk = loop()
    make_ext(disk, kind="ext4")
    write_zfs_labels(disk, *ZFS_AT_THE_END)
    assert call("fs_type", disk.node) == (0, "ext4")


def test_two_file_systems_at_once_are_not_empty(loop):
    disk = loop()
    make_ambivalent(disk)
    assert call("fs_type", disk.node) == (0, "ambivalent")


def test_a_wrong_checksum_does_not_make_a_signature_invisible(loop):
    disk = loop(8 * MIB)
    disk.write(0, image("lvm2"))
    disk.write(512 + 32, b"another id")
    assert call("fs_type", disk.node) == (0, "LVM2_member")


def bsd_label(checksum=None):
    """One with a partition, to be written at byte 64 of a disk (bsd/disklabel.h)."""
    label = bytearray(276)
    struct.pack_into("<I", label, 0, 0x82564557)
    struct.pack_into("<I", label, 132, 0x82564557)
    struct.pack_into("<HHII", label, 136, 0, 8, 8192, 8192)
    struct.pack_into("<IIIBBH", label, 148, 8192, 2048, 1024, 7, 8, 16)
    right = 0
    for word in struct.unpack("<138H", label):
        right ^= word
    struct.pack_into("<H", label, 136, right if checksum is None else checksum)
    return bytes(label)


@pytest.mark.parametrize("checksum", [None, 0x1234], ids=["right", "wrong"])
def test_a_disk_label_is_not_nothing(loop, checksum):
    disk = loop()
    disk.write(64, bsd_label(checksum))
    assert call("fs_type", disk.node) == (0, "bsd")


def test_the_cache_of_blkid_is_never_asked(loop):
    disk = loop()
    run("mkswap", disk.node)
    run("blkid", disk.node)
    run("wipefs", "-qa", disk.node)
    assert call("fs_type", disk.node) == 1


def test_a_device_that_reads_only_at_its_start_is_not_empty(loop):
    disk = loop()
    disk.resize(2 * MIB)  # behind the device's back: it keeps its size, and reads beyond fail
    assert call("check_dev", disk.node) == 0
    assert call("fs_type", disk.node) == (0, "unreadable")


@pytest.mark.parametrize("size", [MIB - 4096, MIB // 2, 4096, 0])
def test_a_device_without_a_whole_mebibyte_to_read_is_not_usable(loop, size):
    empty, formatted = loop(), loop()
    make_ext(formatted)
    for disk in (empty, formatted):  # also where the part that reads would be recognised
        disk.resize(size)
        assert call("check_dev", disk.node) == -1
    assert call("fs_type", empty.node) == -1


def test_a_device_that_does_not_read_at_its_start_has_no_type(loop):
    disk = loop()
    disk.resize(0)
    assert call("fs_type", disk.node) == -1


def test_what_was_read_before_does_not_make_a_device_usable(loop):
    disk = loop()
    assert call("check_dev", disk.node) == 0  # the pages stay: the test holds the device open
    disk.resize(MIB - 4096)
    assert call("check_dev", disk.node) == -1


def test_a_device_is_usable_from_one_mebibyte_on(loop):
    assert call("check_dev", loop(MIB).node) == 0
    assert call("check_dev", loop(MIB - 512).node) == -1


def test_what_is_no_block_device_is_not_usable(tmp_path):
    file = tmp_path / "file"
    file.write_bytes(bytes(2 * MIB))
    for node in (file, tmp_path, "/dev/zero", "/dev/no_such_node"):
        assert call("check_dev", node) == -1


@pytest.mark.parametrize("fault", ["read", "pread64", "preadv", "ioctl"])
def test_no_single_failing_call_makes_a_file_system_look_empty(loop, fault):
    disk = loop()
    make_ext(disk)
    total = len(calls_of("fs_type", disk.node, disk.node, fault))
    for when in range(1, total + 2):
        status, words = under_fault("fs_type", disk.node, disk.node, fault, "error=EIO", when)
        assert status == 0
        assert words[0] != "1", f"{fault} {when} of {total} failed: {words}"


@pytest.mark.parametrize("fault", ["read", "pread64", "preadv"])
def test_reads_that_fail_from_one_on_never_make_a_file_system_look_empty(loop, fault):
    disk = loop()
    make_ext(disk)
    total = len(calls_of("fs_type", disk.node, disk.node, fault))
    for when in range(1, total + 2):
        status, words = under_fault("fs_type", disk.node, disk.node, fault, "error=EIO", f"{when}+")
        assert status == 0
        assert words[0] != "1", f"{fault} from {when} of {total} on failed: {words}"


def write_backup_table(disk):
    disk.sfdisk("label: gpt\n,,L\n")
    disk.write(0, bytes(MIB))


FOUND_LAST = {
    "raid": lambda disk: disk.write(*md_member(64 * MIB, "1.0")),
    "zfs": lambda disk: write_zfs_labels(disk, *ZFS_AT_THE_END),
    "table": write_backup_table,
    "label": lambda disk: disk.write(64, bsd_label()),
}


@pytest.mark.parametrize("times", ["", "+"])
@pytest.mark.parametrize("content", FOUND_LAST)
def test_failing_reads_never_hide_what_is_found_last(loop, content, times):
    disk = loop()
    FOUND_LAST[content](disk)
    assert call("fs_type", disk.node)[0] == 0
    total = len(calls_of("fs_type", disk.node, disk.node, "read"))
    for when in range(1, total + 2):
        status, words = under_fault("fs_type", disk.node, disk.node, "read", "error=EIO", f"{when}{times}")
        assert status == 0
        assert words[0] != "1", f"read {when}{times} of {total} failed: {words}"


# --- the state of a file system ---


def test_a_clean_file_system_wants_no_check(loop):
    for kind in ("ext2", "ext3", "ext4"):
        disk = loop()
        make_ext(disk, kind=kind)
        assert call("check_fs_state", disk.node) == 0, kind


def test_a_mounted_journal_wants_a_check(loop):
    disk = loop()
    make_ext(disk)
    with mounted(disk.node):
        assert call("check_fs_state", disk.node) != 0
    assert call("check_fs_state", disk.node) == 0


@pytest.mark.parametrize("state", ["0", "3"])  # not cleanly unmounted; with errors
def test_a_state_that_is_not_valid_wants_a_check(loop, state):
    disk = loop()
    make_ext(disk, kind="ext2")
    run("debugfs", "-w", "-R", f"ssv state {state}", disk.node)
    assert call("check_fs_state", disk.node) != 0


@pytest.mark.parametrize("feature, at", [("metadata_csum", 120), ("^metadata_csum", 24), ("^metadata_csum,64bit", 254)])
def test_a_damaged_superblock_wants_a_check(loop, feature, at):
    """The label does not fit the checksum; the block size is none; nor is that of a group's descriptor."""
    disk = loop()
    run("mke2fs", "-q", "-t", "ext4", "-O", feature, disk.node)
    disk.write(1024 + at, b"DATA")
    assert call("check_fs_state", disk.node) != 0


def test_other_content_wants_no_check(loop):
    empty, fat = loop(), loop()
    run("mkfs.vfat", fat.node)
    for node in (empty.node, fat.node, "/dev/no_such_node"):
        assert call("check_fs_state", node) == 0


def test_a_node_that_cannot_be_opened_is_not_known(loop):
    disk = loop()
    make_ext(disk)
    status, words = under_fault("fs_type", disk.node, disk.node, "openat", "error=EIO", "1+")
    assert (status, words[:1]) == (0, ["-1"])


@pytest.mark.unsanitized
def test_without_memory_a_file_system_never_counts_as_nothing(loop, tmp_path):
    disk = loop()
    make_ext(disk)
    left = tmp_path / "left"
    scarce = {**os.environ, "LD_PRELOAD": str(CALL.parent / "libscarce.so"), "SCARCE_FILE": str(left)}
    answers, spare = [], 0
    while spare == 0:  # until there are fewer allocations than that
        left.write_bytes(struct.pack("=q", len(answers) + 1))
        done = subprocess.run([CALL, "fs_type", disk.node], env=scarce, stdout=subprocess.PIPE, text=True, timeout=60)
        answers.append(done.stdout.split() if done.returncode == 0 else [f"status {done.returncode}"])
        spare = struct.unpack("=q", left.read_bytes())[0]
    assert {words[0] for words in answers} == {"0", "-1"}, answers
    assert all(len(words) == 2 for words in answers if words[0] == "0"), answers
