"""The one partition of a disk: listed, created, grown, and never in the place of somebody's data."""

import ctypes
import fcntl
import os
import pathlib
import struct
import subprocess
import time
import zlib

import pytest
from harness.sysaux import (
    CALL, MIB, call, calls_of, hfsplus, image, loop, make_ambivalent, make_ext, md_member, mounted, read_at, run, under_fault,
)

__all__ = ["loop"]

ONE_LINUX = "label: {}\nstart=2048,size=40960,type=L\n"


BLKPG, ADD_PARTITION, RESIZE_PARTITION = 0x1269, 1, 3  # of <linux/blkpg.h>


def tell_kernel(disk, operation, number, start, size):
    """Has the kernel know a partition, in sectors of 512 bytes, of which nothing is on the disk."""
    partition = ctypes.create_string_buffer(struct.pack("qqi64s64s", 512 * start, 512 * size, number, b"", b""))
    argument = struct.pack("iiiP", operation, 0, len(partition.raw) - 1, ctypes.addressof(partition))
    with open(disk.node, "rb") as node:
        fcntl.ioctl(node, BLKPG, argument)


def refused(disk):
    """The disk is not given a table, and nothing on it is changed."""
    before, known = disk.digest(), disk.partitions()
    assert call("create", disk.node) != 0
    assert disk.digest() == before
    assert disk.partitions() == known


# --- create ---


def test_an_empty_disk_gets_one_aligned_partition(loop):
    disk = loop(300 * MIB)
    assert call("create", disk.node) == 0
    table = disk.table()
    (entry,) = table["partitions"]
    assert table["label"] == "gpt"
    assert entry["type"].upper() == "0FC63DAF-8483-4772-8E79-3D69D8477DE4"
    assert entry["start"] % 2048 == 0 and (entry["start"] + entry["size"]) % 2048 == 0
    assert disk.partitions() == {1: (entry["start"], entry["size"])}
    assert entry["start"] <= 2048 and entry["start"] + entry["size"] >= 299 * 2048
    run("sfdisk", "--verify", disk.node)
    assert "No problems found" in run("sgdisk", "-v", disk.node)


def test_the_node_is_there_when_the_call_returns(loop):
    disk = loop()
    assert call("create", disk.node) == 0
    number = pathlib.Path(f"/sys/class/block/{disk.name}p1/dev").read_text().strip()
    node = os.stat(disk.part).st_rdev
    assert f"{os.major(node)}:{os.minor(node)}" == number
    make_ext(disk, disk.part)
    assert call("fs_type", disk.part) == (0, "ext4")


@pytest.mark.native
def test_a_disk_with_sectors_of_4096_bytes(loop):
    disk = loop(300 * MIB, "--sector-size", "4096")
    assert call("create", disk.node) == 0
    assert disk.partitions() == {1: (2048, 298 * 2048)}
    assert call("partition_size", f"{disk.name}p1") == 298 * MIB
    disk.grow(500 * MIB)
    assert call("expand", disk.node) == 0
    assert disk.partitions() == {1: (2048, 498 * 2048)}
    run("sfdisk", "--verify", disk.node)


def test_a_link_to_the_disk_will_do(loop, tmp_path):
    disk = loop()
    link = tmp_path / "link"
    link.symlink_to(disk.node)
    assert call("create", link) == 0
    assert call("partition_list", link) == (1, f"{disk.name}p1")
    assert call("disk_space", link) == 64 * MIB


def test_a_disk_of_hardly_a_mebibyte(loop):
    """Too small to be used: whatever the answer, it is true."""
    for size in (MIB, MIB + 512, 2 * MIB):
        disk = loop(size)
        made = call("create", disk.node) == 0
        assert made == (len(disk.partitions()) == 1), size
        count = call("partition_list", disk.node)
        assert (count[0] if isinstance(count, tuple) else count) == (1 if made else 0), size


@pytest.mark.parametrize("label", ["dos", "gpt", "sun", "sgi"])
def test_an_empty_table_may_be_replaced(loop, label):
    disk = loop()
    disk.sfdisk(f"label: {label}\n")
    if disk.table().get("partitions"):  # some kinds describe the whole disk in an entry
        refused(disk)
        return
    assert call("create", disk.node) == 0
    assert disk.table()["label"] == "gpt"
    assert disk.partitions() == {1: (2048, disk.table()["partitions"][0]["size"])}


@pytest.mark.parametrize("kind", ["ext2", "ext3", "ext4"])
def test_a_file_system_without_a_table_is_kept(loop, kind):
    disk = loop()
    make_ext(disk, kind=kind)
    refused(disk)
    assert call("partition_list", disk.node) == 0


@pytest.mark.parametrize("name", ["ntfs", "lvm2", "luks2"])
def test_another_signature_is_kept(loop, name):
    disk = loop(8 * MIB)
    disk.write(0, image(name))
    refused(disk)
    assert call("partition_list", disk.node) == 0


@pytest.mark.parametrize("version", ["1.0", "1.2"])
def test_a_raid_member_is_kept(loop, version):
    disk = loop()
    disk.write(*md_member(64 * MIB, version))
    refused(disk)


def test_vfat_swap_hfsplus_and_two_at_once_are_kept(loop):
    disks = [loop() for _ in range(4)]
    run("mkfs.vfat", disks[0].node)
    run("mkswap", disks[1].node)
    disks[2].write(*hfsplus())
    make_ambivalent(disks[3])
    for disk in disks:
        refused(disk)
        assert call("partition_list", disk.node) == 0


def test_a_signature_with_a_wrong_checksum_is_kept(loop):
    disk = loop(8 * MIB)
    disk.write(0, image("lvm2"))
    disk.write(512 + 32, b"another id")
    refused(disk)


@pytest.mark.parametrize("label", ["dos", "gpt"])
def test_a_disk_with_partitions_is_kept(loop, label):
    disk = loop()
    disk.sfdisk(ONE_LINUX.format(label))
    refused(disk)  # which the kernel has not read yet
    assert call("partition_list", disk.node) == (1, f"{disk.name}p1")
    refused(disk)  # now it has


def test_a_disk_whose_table_is_left_in_the_backup_alone_is_kept(loop):
    disk = loop()
    disk.sfdisk(ONE_LINUX.format("gpt"))
    disk.write(0, bytes(34 * 512))
    refused(disk)


def test_a_disk_that_shrank_below_its_table_is_kept(loop):
    disk = loop()
    assert call("create", disk.node) == 0
    disk.forget()
    disk.grow(40 * MIB)
    refused(disk)
    assert call("partition_list", disk.node) == -1


def test_a_partition_that_only_the_kernel_knows_is_kept(loop):
    disk = loop()
    tell_kernel(disk, ADD_PARTITION, 3, 2048, 4096)
    refused(disk)


def test_a_disk_in_use_is_kept(loop):
    disk = loop()
    make_ext(disk)
    with mounted(disk.node):
        disk.write(1024, bytes(1024))  # its signature is gone from the disk, but it is mounted
        assert call("create", disk.node) != 0
        assert disk.partitions() == {}


def test_a_partition_is_no_disk(loop):
    disk = loop()
    assert call("create", disk.node) == 0
    before = disk.digest()
    assert call("create", disk.part) != 0
    assert call("expand", disk.part) != 0
    assert disk.digest() == before


def test_a_disk_that_cannot_be_read_is_kept(loop):
    disk = loop()
    disk.resize(MIB - 4096)  # behind the device's back
    assert call("create", disk.node) != 0
    assert call("partition_list", disk.node) == -1
    assert disk.file.stat().st_size == MIB - 4096


def test_a_disk_that_reads_only_at_its_start_is_kept(loop):
    disk = loop()
    disk.resize(2 * MIB)
    assert call("create", disk.node) != 0
    assert call("partition_list", disk.node) == -1
    assert disk.file.stat().st_size == 2 * MIB


def test_a_write_protected_disk_fails(loop):
    disk = loop(64 * MIB, "-r")
    refused(disk)


@pytest.fixture
def full_folder(tmp_path):
    """A folder that takes no more data: what is written to a sparse file in it fails."""
    folder = tmp_path / "full"
    folder.mkdir()
    run("mount", "-t", "tmpfs", "-o", "size=64k", "tmpfs", folder)
    (folder / "filler").write_bytes(bytes(64 * 1024))
    yield folder
    run("umount", "-l", folder)


def test_a_disk_that_refuses_writes_fails(full_folder, loop):
    """The writes end in the page cache; that the disk refuses them shows at the sync."""
    disk = loop(64 * MIB, folder=full_folder)
    assert call("create", disk.node) != 0
    assert disk.partitions() == {}


def test_missing_devices_and_files_fail(tmp_path):
    file = tmp_path / "file"
    file.write_bytes(bytes(2 * MIB))
    for device in ("/dev/no_such_disk", file, tmp_path, "/dev/null"):
        assert call("create", device) != 0
        assert call("expand", device) != 0
        assert call("partition_list", device) == -1
        assert call("disk_space", device) <= 0
    assert file.read_bytes() == bytes(2 * MIB)


def test_a_locked_disk_is_waited_for(loop):
    disk = loop()
    create = [CALL, "create", disk.node]
    with subprocess.Popen(["flock", disk.node, "cat"], stdin=subprocess.PIPE) as holder:
        while subprocess.run(["flock", "-n", disk.node, "true"]).returncode == 0:
            pass
        with subprocess.Popen(create, stdout=subprocess.PIPE) as creator:
            with pytest.raises(subprocess.TimeoutExpired):
                creator.wait(0.3)
            assert disk.partitions() == {}
            holder.stdin.close()
            assert creator.communicate(timeout=20)[0] == b"0\n"
    assert len(disk.partitions()) == 1


def test_a_bad_spot_in_the_first_mebibyte_is_enough_to_refuse(loop):
    """Where no signature is looked for, too."""
    disk = loop()
    assert under_fault("create", disk.node, disk.node, "preadv", "error=EIO", "1") == (0, ["-1"])
    assert disk.partitions() == {} and disk.digest() == loop().digest()


def test_an_entry_that_recognition_takes_for_invalid_is_kept(loop):
    """libblkid passes over an entry beyond the usable sectors; libfdisk lists it."""
    disk = loop()
    disk.sfdisk(ONE_LINUX.format("gpt"))
    for header_at in (512, 64 * MIB - 512):
        header = bytearray(read_at(disk, header_at, 512))
        header[48:56] = (20000).to_bytes(8, "little")  # the last usable sector
        header[16:20] = bytes(4)
        header[16:20] = zlib.crc32(header[:92]).to_bytes(4, "little")
        disk.write(header_at, header)
    assert "start=        2048, size=       40960" in run("sfdisk", "-d", disk.node)
    assert call("partition_list", disk.node) == 0
    refused(disk)


@pytest.mark.parametrize("label", ["dos", "gpt"])
def test_no_failing_sync_is_overlooked(loop, label):
    """But for the last, which libfdisk makes when it lets go of the disk: all is on the disk by then."""
    disk = loop()
    disk.sfdisk(ONE_LINUX.format(label))
    assert call("partition_list", disk.node) == (1, f"{disk.name}p1")
    head = read_at(disk, 0, MIB)
    total = len(calls_of("expand", disk.node, disk.node, "fsync"))
    assert total > 1
    for when in range(1, total):
        disk.forget()
        disk.wipe_ends()
        disk.write(0, head)
        assert call("partition_list", disk.node) == (1, f"{disk.name}p1")
        assert under_fault("expand", disk.node, disk.node, "fsync", "error=EIO", f"{when}+") == (0, ["-1"]), when
        assert disk.partitions() == {1: (2048, 40960)}


# --- the node in /dev ---


def in_a_bare_dev(disk, script):
    """Runs a script where /dev has nothing but a few harmless nodes; $1 is sysaux_call, $2 the disk's name and $3 its number."""
    number = os.stat(disk.node).st_rdev
    return run(
        "unshare", "--mount", "sh", "-ec",
        "mount -t tmpfs tmpfs /dev; mknod /dev/null c 1 3; mknod /dev/urandom c 1 9\n" + script,
        "sh", CALL, disk.name, f"{os.major(number)} {os.minor(number)}",
    )


def test_a_node_that_comes_late_is_waited_for(loop):
    disk = loop()
    out = in_a_bare_dev(disk, """
        mknod /dev/$2 b $3
        (while ! numbers=$(cat /sys/class/block/$2p1/dev 2>/dev/null); do sleep 0.01; done
         sleep 0.5; mknod /dev/$2p1 b ${numbers%:*} ${numbers#*:}) &
        $1 create /dev/$2
        test -b /dev/$2p1 && echo there
        wait
        """)
    assert out == "0\nthere\n"


def test_a_disk_without_a_node_is_asked_for_in_sysfs(loop):
    """The tool makes the node once it knows that there is a disk."""
    disk = loop()
    ask = "for call in disk_space partition_list; do $1 $call /dev/$2; done"
    assert in_a_bare_dev(disk, ask) == f"{64 * MIB}\n0 \n"
    assert call("create", disk.node) == 0
    assert in_a_bare_dev(disk, ask) == f"{64 * MIB}\n1 {disk.name}p1\n"
    assert in_a_bare_dev(disk, "$1 disk_space /dev/$2p1") == f"{62 * MIB}\n"


def test_a_node_that_is_missing_makes_nothing_usable(loop):
    disk = loop()
    for name, result in (("check_dev", "-1"), ("fs_type", "-1 "), ("create", "-1"), ("expand", "-1")):
        assert in_a_bare_dev(disk, f"$1 {name} /dev/$2 || :") == result + "\n", name
    assert disk.partitions() == {}


@pytest.mark.parametrize("path", ["/dev/", "/dev/.", "/dev/..", "/dev/../block/$2", "/dev/no_such_disk", "$2", "/x/$2",
                                  "/dev/$2/"])
def test_only_the_name_of_a_disk_is_asked_for_in_sysfs(loop, path):
    assert in_a_bare_dev(loop(), f"$1 disk_space {path} || :") == "-1\n"


@pytest.mark.parametrize("thing", ["touch /dev/$2", "mkdir /dev/$2", "mknod /dev/$2 c 1 3"])
def test_what_stands_in_the_place_of_a_node_is_no_disk(loop, thing):
    assert in_a_bare_dev(loop(), f"{thing}; $1 disk_space /dev/$2 || :") == "-1\n"


def test_a_node_that_never_comes_is_waited_for_5_seconds(loop):
    disk = loop()
    begun = time.monotonic()
    assert in_a_bare_dev(disk, "mknod /dev/$2 b $3; $1 create /dev/$2") == "0\n"
    assert 5 <= time.monotonic() - begun < 15
    assert len(disk.partitions()) == 1


def test_a_dev_that_nobody_fills_is_not_waited_for(loop):
    """The disk goes by a name of the caller's own there."""
    taken = []
    while not taken or (taken[-1] >= 5 and len(taken) < 3):  # a busy machine may take that long for its part
        disk = loop()
        begun = time.monotonic()
        assert in_a_bare_dev(disk, "mknod /dev/sdb b $3; $1 create /dev/sdb") == "0\n"
        taken.append(time.monotonic() - begun)
        assert len(disk.partitions()) == 1
    assert taken[-1] < 5


# --- list ---


def test_partitions_are_listed_in_the_order_of_their_numbers(loop):
    disk = loop()
    disk.sfdisk("label: gpt\n" + "".join(f"{n}: start={2048 * n},size=2048\n" for n in (11, 2, 1, 10)))
    run("partx", "-a", disk.node)
    assert call("partition_list", disk.node) == (4, ",".join(f"{disk.name}p{n}" for n in (1, 2, 10, 11)))


@pytest.mark.parametrize("label", ["dos", "gpt"])
def test_a_table_that_the_kernel_has_not_read_is_announced(loop, label):
    disk = loop()
    disk.sfdisk(f"label: {label}\nstart=2048,size=20480\nstart=22528,size=20480\n")
    assert disk.partitions() == {}
    assert call("partition_list", disk.node) == (2, f"{disk.name}p1,{disk.name}p2")
    assert disk.partitions() == {1: (2048, 20480), 2: (22528, 20480)}
    assert os.path.exists(f"{disk.node}p2")


def test_an_extended_partition_is_no_place_for_a_file_system(loop):
    disk = loop()
    disk.sfdisk("label: dos\nstart=2048,size=20480\nstart=22528,size=40960,type=5\nstart=24576,size=8192\n")
    names = [f"{disk.name}p{n}" for n in (1, 2, 5)]
    assert call("partition_list", disk.node) == (3, ",".join(names))
    assert disk.partitions() == {1: (2048, 20480), 2: (22528, 2), 5: (24576, 8192)}
    assert call("check_dev", f"/dev/{names[1]}") == -1
    assert call("check_dev", f"/dev/{names[2]}") == 0


# What of a disk is lost, as the offset and the length of its parts.
LOST = {"protective MBR": [(0, 512)], "primary": [(512, 512)], "all of the start": [(0, 34 * 512)],
        "MBR by an empty one": [(446, 64), (512, 512)]}


@pytest.mark.parametrize("lost", LOST.values(), ids=LOST)
def test_a_table_in_the_backup_alone_counts(loop, lost):
    disk = loop()
    disk.sfdisk(ONE_LINUX.format("gpt"))
    for start, length in lost:
        disk.write(start, bytes(length))
    assert call("partition_list", disk.node) == (1, f"{disk.name}p1")
    assert disk.partitions() == {1: (2048, 40960)}


def test_partitions_beyond_the_end_of_a_shrunken_disk_count(loop):
    disk = loop()
    disk.sfdisk("label: dos\nstart=2048,size=100000\n")
    disk.grow(20 * MIB)
    assert call("partition_list", disk.node) == (1, f"{disk.name}p1")


def test_a_list_too_long_for_the_buffer_is_cut_between_names(loop):
    disk = loop(300 * MIB)
    disk.sfdisk("label: gpt\n" + "".join(f"{n}: start={2048 * n},size=2048\n" for n in range(1, 129)))
    for _ in range(2):  # from the table, then from the kernel
        count, names = call("partition_list", disk.node)
        assert count == 128 == len(disk.partitions())
        assert 1024 - 12 < len(names) < 1024
        assert names.split(",") == [f"{disk.name}p{n + 1}" for n in range(len(names.split(",")))]


def test_an_empty_disk_has_no_partitions(loop):
    assert call("partition_list", loop().node) == 0


@pytest.mark.parametrize("fault", ["read", "ioctl", "openat"])
@pytest.mark.parametrize("label", ["dos", "gpt"])
def test_no_failing_call_makes_a_disk_with_a_partition_look_empty(loop, fault, label):
    disk = loop()
    disk.sfdisk(ONE_LINUX.format(label))
    total = len(calls_of("partition_list", disk.node, disk.node, fault))
    for when in range(1, total + 2):
        for times in ("", "+"):
            disk.forget()
            status, words = under_fault("partition_list", disk.node, disk.node, fault, "error=EIO", f"{when}{times}")
            assert status == 0
            assert words[0] != "0", f"{fault} {when}{times} of {total}: {words}"


# --- sizes ---


def test_sizes_are_in_bytes(loop):
    disk = loop(300 * MIB)
    assert call("disk_space", disk.node) == 300 * MIB
    assert call("create", disk.node) == 0
    assert call("partition_size", f"{disk.name}p1") == 298 * MIB
    assert call("disk_space", disk.part) == 298 * MIB


def test_sizes_of_what_is_not_there_are_unknown():
    for name in ("no_such_partition", "", "..", "../block/loop0", "x" * 5000):
        assert call("partition_size", name) <= 0
    for device in ("/dev/no_such_disk", "/dev/null", "/", "", "x" * 5000):
        assert call("disk_space", device) <= 0


# --- expand ---


def filled(loop, script=None, size=200 * MIB):
    """A disk with one ext4 partition and a file in it."""
    disk = loop(size)
    if script is None:
        assert call("create", disk.node) == 0
    else:
        disk.sfdisk(script)
        assert call("partition_list", disk.node)[0] >= 1
    make_ext(disk, disk.part)
    with mounted(disk.part) as folder:
        (folder / "data").write_bytes(bytes(range(256)) * 4096)
    return disk


def assert_intact(disk):
    run("e2fsck", "-fn", disk.part)
    with mounted(disk.part) as folder:
        assert (folder / "data").read_bytes() == bytes(range(256)) * 4096


@pytest.mark.parametrize("more", [50 * MIB, 200 * MIB])
@pytest.mark.native
def test_the_partition_grows_with_the_disk_and_keeps_its_data(loop, more):
    disk = filled(loop)
    before = disk.table()
    disk.grow(200 * MIB + more)
    assert call("expand", disk.node) == 0
    after = disk.table()
    size = before["partitions"][0]["size"] + more // 512
    assert disk.partitions() == {1: (2048, size)}
    assert after["partitions"][0] == {**before["partitions"][0], "size": size}  # uuid, type and start stay
    assert after["id"] == before["id"]
    assert "No problems found" in run("sgdisk", "-v", disk.node)  # also: the backup header is at the end
    assert_intact(disk)
    run("e2fsck", "-fy", disk.part)  # which resize2fs asks for after a mount
    run("resize2fs", disk.part)
    assert_intact(disk)


@pytest.mark.native
def test_a_mounted_partition_grows(loop):
    disk = filled(loop)
    disk.grow(400 * MIB)
    with mounted(disk.part) as folder:
        with open(folder / "busy", "w") as busy:
            busy.write("x")
            assert call("expand", disk.node) == 0
        assert disk.partitions() == {1: (2048, 398 * 2048)}
    run("sfdisk", "--verify", disk.node)
    assert_intact(disk)


@pytest.mark.native
def test_a_partition_that_ends_unaligned_grows_to_an_aligned_end(loop):
    disk = filled(loop, "label: gpt\nstart=2049,size=100001\n")
    assert call("expand", disk.node) == 0
    assert disk.partitions() == {1: (2049, 199 * 2048 - 2049)}
    assert_intact(disk)


@pytest.mark.native
def test_a_partition_that_is_not_the_first_grows(loop):
    disk = loop(200 * MIB)
    disk.sfdisk("label: gpt\n3: start=4096,size=40960\n")
    assert call("partition_list", disk.node) == (1, f"{disk.name}p3")
    assert call("expand", disk.node) == 0
    assert disk.partitions() == {3: (4096, 199 * 2048 - 4096)}


def test_a_partition_at_the_end_stays_as_it_is(loop):
    disk = loop()
    assert call("create", disk.node) == 0
    before = disk.digest()
    assert call("expand", disk.node) == 0
    assert disk.digest() == before


@pytest.mark.native
def test_a_partition_of_a_dos_table_grows(loop):
    disk = filled(loop, "label: dos\nstart=2048,size=204800,bootable\n", size=101 * MIB)
    disk.grow(400 * MIB)
    before = disk.table()
    assert call("expand", disk.node) == 0
    assert disk.partitions() == {1: (2048, 399 * 2048)}
    assert disk.table()["partitions"][0] == {**before["partitions"][0], "size": 399 * 2048}
    assert_intact(disk)


@pytest.mark.native
def test_a_dos_table_ends_at_2_tebibytes(loop):
    disk = loop(MIB << 10)
    disk.sfdisk("label: dos\nstart=2048,size=204800\n")
    assert call("partition_list", disk.node)[0] == 1
    disk.grow(MIB << 22)  # 4 TiB
    assert call("expand", disk.node) == 0
    ((start, size),) = disk.partitions().values()
    assert start == 2048 and 2**32 - 4096 <= start + size < 2**32
    before = disk.digest()
    assert call("expand", disk.node) != 0
    assert disk.digest() == before


@pytest.mark.native
def test_a_gpt_grows_beyond_2_tebibytes(loop):
    disk = loop(MIB << 20)
    assert call("create", disk.node) == 0
    disk.grow(MIB << 22)
    assert call("expand", disk.node) == 0
    assert disk.partitions() == {1: (2048, (MIB << 22) // 512 - 4096)}
    run("sfdisk", "--verify", disk.node)


@pytest.mark.parametrize(
    "script",
    [
        "label: gpt\nstart=2048,size=20480\nstart=22528,size=20480\n",
        "label: dos\nstart=2048,size=20480\nstart=22528,size=20480\n",
        "label: dos\nstart=22528,size=40960,type=5\n",
        "label: dos\nstart=22528,size=40960,type=5\nstart=24576,size=8192\n",
        "label: dos\nstart=1,size=40960,type=ee\n",
        "label: gpt\n",
    ],
)
def test_anything_but_one_plain_partition_is_left_alone(loop, script):
    disk = loop()
    disk.sfdisk(script)
    call("partition_list", disk.node)
    before, known = disk.digest(), disk.partitions()
    assert call("expand", disk.node) != 0
    assert disk.digest() == before
    assert disk.partitions() == known


def test_a_disk_without_a_table_is_not_grown(loop):
    disk, empty = loop(), loop()
    make_ext(disk)
    for each in (disk, empty):
        before = each.digest()
        assert call("expand", each.node) != 0
        assert each.digest() == before


def test_a_partition_that_the_kernel_has_elsewhere_is_left_alone(loop):
    disk = loop()
    disk.sfdisk(ONE_LINUX.format("gpt"))
    tell_kernel(disk, ADD_PARTITION, 1, 4096, 20480)
    before = disk.digest()
    assert call("expand", disk.node) != 0
    assert disk.digest() == before
    assert disk.partitions() == {1: (4096, 20480)}


@pytest.mark.native
def test_a_kernel_that_missed_the_growth_is_told_again(loop):
    disk = loop()
    assert call("create", disk.node) == 0
    shown = disk.partitions()
    tell_kernel(disk, RESIZE_PARTITION, 1, shown[1][0], 20480)
    assert disk.partitions() != shown
    assert call("expand", disk.node) == 0
    assert disk.partitions() == shown


@pytest.mark.native
def test_a_change_that_the_kernel_refuses_is_no_success(loop):
    """The kernel's refusal is the only sign: the table is written by then."""
    grown, fresh = loop(), loop()
    assert call("create", grown.node) == 0
    grown.grow(200 * MIB)
    with open(grown.file, "rb") as file:
        head = file.read(MIB)

    def give_back_the_table():
        grown.write(0, head)
        assert call("partition_list", grown.node) == (1, f"{grown.name}p1")

    for disk, name, prepare in ((grown, "expand", give_back_the_table), (fresh, "create", lambda: None)):
        known = disk.partitions()
        ioctls = calls_of(name, disk.node, disk.node, "ioctl")
        (when,) = (number for number, text in enumerate(ioctls, 1) if "BLKPG" in text)
        disk.forget()
        disk.wipe_ends()
        prepare()
        assert disk.partitions() == known
        assert under_fault(name, disk.node, disk.node, "ioctl", "error=EBUSY", when) == (0, ["-1"])
        assert disk.partitions() == known
    assert call("expand", grown.node) == 0


def test_a_write_protected_disk_is_not_grown(loop):
    disk = loop()
    assert call("create", disk.node) == 0
    disk.grow(200 * MIB)
    known = disk.partitions()
    run("blockdev", "--setro", disk.node)
    assert call("expand", disk.node) != 0
    assert disk.partitions() == known


# --- faults and kills at every system call ---

SYSCALLS = ["openat", "read", "pread64", "preadv", "write", "fsync", "ioctl", "flock"]


@pytest.mark.parametrize("fault", SYSCALLS)
def test_no_failing_call_makes_creation_overwrite_data(loop, fault):
    disk = loop(16 * MIB)
    make_ext(disk)
    before = disk.digest()
    total = len(calls_of("create", disk.node, disk.node, fault))
    for when in range(1, total + 2):
        for times in ("", "+"):
            if fault == "flock" and times:
                continue  # a lock that never comes is waited for
            status, words = under_fault("create", disk.node, disk.node, fault, "error=EIO", f"{when}{times}")
            assert (status, words) == (0, ["-1"]), f"{fault} {when}{times} of {total}"
            assert disk.digest() == before, f"{fault} {when}{times} of {total}"


@pytest.mark.parametrize("fault", SYSCALLS)
def test_creation_under_faults_tells_the_truth(loop, fault):
    disk = loop(16 * MIB)
    total = len(calls_of("create", disk.node, disk.node, fault))
    for when in range(1, total + 2):
        disk.forget()
        disk.wipe_ends()
        status, words = under_fault("create", disk.node, disk.node, fault, "error=EIO", when)
        assert status == 0
        if words == ["0"]:
            assert disk.partitions() == {1: (2048, 14 * 2048)}, f"{fault} {when} of {total}"
            run("sfdisk", "--verify", disk.node)


@pytest.mark.parametrize("fault", ["write", "fsync", "ioctl", "close"])
@pytest.mark.parametrize("end", ["error=EIO", "signal=SIGKILL"])
@pytest.mark.native
def test_growth_that_is_cut_short_keeps_the_partition(loop, fault, end):
    disk = filled(loop, size=20 * MIB)
    disk.grow(40 * MIB)
    head = disk.file.read_bytes()[:MIB]
    total = len(calls_of("expand", disk.node, disk.node, fault))
    for when in range(1, total + 1):
        disk.forget()
        disk.wipe_ends()
        disk.write(0, head)
        assert call("partition_list", disk.node)[0] == 1
        status, words = under_fault("expand", disk.node, disk.node, fault, end, when)
        if words == ["0"]:
            assert disk.partitions() == {1: (2048, 38 * 2048)}
        disk.forget()
        assert call("partition_list", disk.node) == (1, f"{disk.name}p1"), f"{fault} {when} of {total}"
        assert disk.partitions()[1][0] == 2048
        assert call("expand", disk.node) == 0, f"{fault} {when} of {total}"
        assert disk.partitions() == {1: (2048, 38 * 2048)}
        run("sfdisk", "--verify", disk.node)
        run("e2fsck", "-fn", disk.part)
