"""From a bare LUN to a mounted folder and back, on real disks with the real commands."""

import os
import random
import signal
import stat
import string

import pytest
from harness import messages, startswith
from harness.sysaux import Loop, image, make_ambivalent, make_ext, md_member, mounted, run
from harness.volumes import drive, luns

__all__ = ["luns"]

MIB = 1 << 20
ONE_PARTITION = "label: gpt\nstart=2048,type=L\n"
TWO_PARTITIONS = "label: gpt\nstart=2048,size=200000,type=L\nstart=204800,size=200000,type=L\n"
FILES = {"a file": b"contents\n", "large": os.urandom(3 * MIB)}


def partition(lun, script=ONE_PARTITION):
    """A table that another system wrote; the kernel knows it."""
    lun.disk.sfdisk(script)
    run("partx", "-a", lun.disk.node)


def fill(node):
    """Files on a file system that is not mounted in the box."""
    with mounted(node) as folder:
        for name, data in FILES.items():
            (folder / name).write_bytes(data)


def keep_files(lun):
    for name, data in FILES.items():
        lun.write_file(name, data)


def assert_files(lun):
    for name, data in FILES.items():
        assert lun.read_file(name) == data


def assert_mounted(lun, kind, node=None):
    assert lun.mounted()
    assert lun.path().stat().st_mode & 0o7777 == 0o777
    wanted = {"mnt_dev": node or lun.disk.part, "mnt": lun.mount_point, "fs_type": kind, "format_state": "0",
              "volume_state": "0", "vol_access_right": "1"}
    assert {name: lun.key(name) for name in wanted} == wanted


def assert_gone(lun):
    assert not lun.mounts()
    assert not lun.box.path(lun.mount_point).exists()


def formatted(lun):
    """Whether a mke2fs ran."""
    return any("mke2fs" in command for command in lun.box.shell())


# --- from a fresh disk, and back ---


def test_a_fresh_disk_is_partitioned_formatted_and_mounted(luns):
    lun = luns(300 * MIB)
    assert lun.mount().result == 0
    assert_mounted(lun, "ext4")
    assert lun.key("format_progress") == "100"
    assert len(lun.disk.partitions()) == 1
    assert lun.disk.table()["label"] == "gpt"
    keep_files(lun)
    assert lun.unmount().result == 0
    assert_gone(lun)
    lun.box.forget()
    assert lun.mount().result == 0
    assert not formatted(lun)
    assert_mounted(lun, "ext4")
    assert_files(lun)


@pytest.mark.parametrize("share", ["Data", "two words", "tab\tnew\nline \\ #", "a/b"])
def test_a_volume_in_use_is_neither_checked_nor_mounted_again(luns, share):
    lun = luns(300 * MIB, share)
    lun.mount()
    keep_files(lun)
    lun.path().chmod(0o700)
    lun.box.tree.delete(f"/iscsi/initiator/id:1/lun/id:{lun.slot}/mnt_dev")
    lun.box.forget()
    assert lun.mount().result == 0
    assert [command.split()[0] for command in lun.box.shell()] == ["resize2fs", "chmod"]
    assert lun.mounts() == [lun.mount_point]
    assert_mounted(lun, "ext4")
    assert_files(lun)


def test_a_volume_in_use_is_known_by_its_device_not_by_a_name(luns):
    lun = luns(300 * MIB)
    lun.mount()
    lun.unmount()
    other = f"/tmp/{lun.disk.name}"
    lun.box.path(lun.mount_point).mkdir()
    device = os.stat(lun.disk.part).st_rdev
    os.mknod(lun.box.path(other), stat.S_IFBLK | 0o600, device)
    assert lun.box.run(["/usr/bin/mount", other, lun.mount_point]).status == 0
    lun.box.forget()
    assert lun.mount().result == 0
    assert not lun.box.runs("mount")
    assert lun.box.run(["/usr/bin/umount", lun.mount_point]).status == 0


@pytest.mark.parametrize("look", [
    lambda lun: {"ret": -1},
    lambda lun: {"through": True, "times": 1, "effect": f"umount {lun.mount_point}"},
], ids=["shows nothing", "is when it is taken away"])
def test_a_volume_in_use_is_not_formatted_whatever_the_look_at_its_disk(luns, look):
    lun = luns(300 * MIB)
    lun.mount()
    keep_files(lun)
    lun.box.forget()
    lun.box.hook("sys_get_fs_type", lun.disk.part, **look(lun))
    assert lun.mount().result == 0
    assert not formatted(lun)
    assert_mounted(lun, "ext4")
    assert_files(lun)


def test_a_volume_in_use_that_is_taken_away_is_not_formatted_when_its_disk_shows_nothing(luns):
    lun = luns(300 * MIB)
    lun.mount()
    keep_files(lun)
    lun.box.hook("sys_get_fs_type", lun.disk.part, ret=-1, effect=f"umount {lun.mount_point}")
    lun.box.forget()
    done = lun.mount()
    assert (done.result, formatted(lun)) == (-2, False)
    assert f"{lun.disk.part} carried a file system a moment ago and shows none now, it is left alone" in messages(done)
    assert lun.box.run(["/usr/bin/mount", lun.disk.part, lun.mount_point]).status == 0
    assert_files(lun)


def test_nobody_takes_a_volume_in_use_away_while_it_is_recorded(luns):
    lun = luns(300 * MIB)
    lun.mount()
    look = "for lock in session volume; do flock -n /run/remvol/$lock-*.lock true; echo $?; done >/root/held"
    lun.box.hook("system", startswith("chmod 777 "), through=True, effect=look)
    assert lun.mount().result == 0
    assert lun.box.path("/root/held").read_text() == "1\n1\n"


def hold_mount_point(lun):
    """Another run works at the mount point; /root/holder has its process number."""
    hold = "exec 9</run/remvol/volume-*.lock; flock 9; echo $$ >/root/holder; exec sleep 1000"
    holder = lun.box.start(["/bin/bash", "-c", hold], env={"LD_PRELOAD": None, "PATH": "/usr/bin:/bin"})
    lun.box.wait_until(lambda: lun.box.path("/root/holder").exists())
    return holder


def test_a_volume_in_use_at_whose_mount_point_another_run_works_is_not_recorded(luns):
    lun = luns(300 * MIB)
    lun.mount()
    hold_mount_point(lun)
    lun.box.tree.set(f"/iscsi/initiator/id:1/lun/id:{lun.slot}/volume_state", 2)
    lun.box.forget()
    done = lun.mount()
    assert (done.result, lun.key("volume_state"), lun.box.shell()) == (-1, "2", [])
    assert f"{lun.mount_point} is neither made nor removed, another run is at work there" in messages(done)


def test_a_volume_that_another_run_mounts_meanwhile_is_not_mounted_twice(luns):
    lun = luns(300 * MIB)
    lun.mount()
    lun.unmount()
    hold_mount_point(lun)
    mount = f"mkdir {lun.mount_point}; mount {lun.disk.part} {lun.mount_point}; kill $(cat /root/holder)"
    lun.box.hook("usleep", "20000", through=True, times=1, effect=mount)
    lun.box.forget()
    assert lun.mount().result == 0
    assert not lun.box.runs("mount")
    assert lun.mounts() == [lun.mount_point]
    assert_mounted(lun, "ext4")


def test_a_volume_that_is_mounted_elsewhere_is_mounted(luns):
    lun = luns(300 * MIB)
    lun.mount()
    lun.unmount()
    lun.box.path("/mnt/elsewhere").mkdir()
    assert lun.box.run(["/usr/bin/mount", lun.disk.part, "/mnt/elsewhere"]).status == 0
    assert lun.mount().result == 0
    assert lun.mounts() == ["/mnt/elsewhere", lun.mount_point]


def test_the_status_follows(luns):
    lun = luns(300 * MIB)
    assert lun.mount().result == 0
    drive(lun.box, "unmount_all")
    assert (lun.key("status"), lun.key("size")) == ("Offline", "0/0")
    assert_gone(lun)


def test_two_luns_of_a_target(luns):
    first, second = luns(300 * MIB), luns(200 * MIB)
    assert first.mount().result == 0
    assert second.mount().result == 0
    assert_mounted(first, "ext4")
    assert_mounted(second, "ext4")
    keep_files(second)
    assert first.unmount().result == 0
    assert_files(second)


# --- what is there already ---


MAKE = {**{kind: ["mke2fs", "-q", "-F", "-t", kind] for kind in ("ext2", "ext3", "ext4")}, "xfs": ["mkfs.xfs", "-q"]}


@pytest.mark.parametrize("kind, make", MAKE.items(), ids=MAKE)
def test_a_partition_with_a_file_system_is_mounted_as_it_is(luns, kind, make):
    lun = luns(400 * MIB)
    partition(lun)
    run(*make, lun.disk.part)
    fill(lun.disk.part)
    known = lun.disk.partitions()
    assert lun.mount().result == 0
    assert not formatted(lun)
    assert_mounted(lun, kind)
    assert_files(lun)
    assert lun.disk.partitions() == known
    assert lun.unmount().result == 0
    assert_gone(lun)


def test_vfat_is_mounted_with_its_options_or_left_as_it_is(luns):
    """Where the kernel has no vfat the mount fails as any other."""
    lun = luns(300 * MIB)
    partition(lun)
    run("mkfs.vfat", lun.disk.part)
    before = lun.disk.digest()
    lun.box.fake("mount", "-t vfat", status=32)
    assert lun.mount().result == 0
    assert [list(call) for call in lun.box.runs("mount")] == 4 * [
        ["-t", "vfat", "-o", "umask=0,iocharset=utf8,shortname=winnt", lun.disk.part, lun.mount_point]]
    assert lun.key("volume_state") == "3"
    assert not formatted(lun)
    assert_gone(lun)
    assert lun.disk.digest() == before


@pytest.mark.parametrize("kind", ["ext2", "ext3"])
def test_a_format_keeps_ext2_and_ext3(luns, kind):
    lun = luns(300 * MIB)
    partition(lun)
    make_ext(lun.disk, lun.disk.part, kind)
    fill(lun.disk.part)
    assert lun.mount(force=1).result == 0
    assert_mounted(lun, kind)
    assert os.listdir(lun.path()) == ["lost+found"]


def test_an_empty_partition_is_formatted(luns):
    lun = luns(300 * MIB)
    partition(lun)
    assert lun.mount().result == 0
    assert formatted(lun)
    assert_mounted(lun, "ext4")


def test_of_two_partitions_the_recognised_one_is_taken(luns):
    lun = luns(300 * MIB)
    partition(lun, TWO_PARTITIONS)
    lun.disk.write(2048 * 512, b"no file system, but somebody's" * 100)
    second = f"{lun.disk.node}p2"
    make_ext(lun.disk, second)
    fill(second)
    known = lun.disk.partitions()
    assert lun.mount().result == 0
    assert not formatted(lun)
    assert_mounted(lun, "ext4", second)
    assert_files(lun)
    assert lun.disk.partitions() == known
    with open(lun.disk.part, "rb") as first:
        assert first.read(3000) == b"no file system, but somebody's" * 100


@pytest.mark.parametrize("name", ["lvm2", "luks2"])
def test_a_partition_with_another_signature_is_unsupported(luns, name):
    lun = luns(300 * MIB)
    partition(lun)
    lun.disk.write(MIB, image(name))
    before = lun.disk.digest()
    assert lun.mount().result == -6
    assert lun.key("volume_state") == "5"
    assert not formatted(lun)
    assert lun.disk.digest() == before


def test_a_partition_that_may_be_two_things_is_unsupported(luns):
    lun = luns(300 * MIB)
    partition(lun)
    make_ambivalent(lun.disk, lun.disk.part)
    before = lun.disk.digest()
    assert lun.mount().result == -6
    assert lun.disk.digest() == before


CONTENTS = {
    "lvm2": lambda disk: disk.write(0, image("lvm2")),
    "luks2": lambda disk: disk.write(0, image("luks2")),
    "ext4": make_ext,
    "xfs": lambda disk: run("mkfs.xfs", "-q", disk.node),
    "raid": lambda disk: disk.write(*md_member(400 * MIB, "1.2")),
}


@pytest.mark.parametrize("fill", CONTENTS.values(), ids=CONTENTS)
def test_a_disk_without_a_table_that_carries_something_is_kept(luns, fill):
    lun = luns(400 * MIB)
    fill(lun.disk)
    before = lun.disk.digest()
    assert lun.mount().result == -2
    assert lun.key("volume_state") == "3"
    assert lun.disk.digest() == before
    assert not lun.box.shell()


# --- disks that grew ---


def test_a_disk_that_grew_a_little_is_left_alone(luns):
    lun = luns(400 * MIB)
    lun.mount()
    keep_files(lun)
    lun.unmount()
    known = lun.disk.partitions()
    lun.disk.grow(450 * MIB)
    assert lun.mount().result == 0
    assert lun.disk.partitions() == known
    assert_files(lun)


@pytest.mark.native
def test_a_disk_that_grew_gets_its_partition_grown(luns):
    lun = luns(400 * MIB)
    lun.mount()
    keep_files(lun)
    lun.unmount()
    (start, size), = lun.disk.partitions().values()
    lun.disk.grow(600 * MIB)
    lun.box.forget()
    assert lun.mount().result == 0
    assert lun.disk.partitions()[1][0] == start
    assert lun.disk.partitions()[1][1] - size >= 199 * MIB // 512
    assert_files(lun)
    assert_mounted(lun, "ext4")
    assert not formatted(lun)
    lun.box.wait_quiet()
    [resize] = lun.box.runs("resize2fs")
    assert resize == ["-fp", lun.disk.part]
    run("sfdisk", "--verify", lun.disk.node)


# --- disks with faults ---


def test_a_disk_of_a_mebibyte_is_offline(luns):
    lun = luns(MIB)
    assert lun.mount().result == -8
    assert lun.key("volume_state") is None
    assert not lun.box.shell()


def test_the_next_larger_disk_is_tried(luns):
    """It holds no partition of a usable size."""
    lun = luns(MIB + 512)
    assert lun.mount().result == -2
    assert not lun.box.shell()


def test_a_fresh_disk_that_cannot_be_written_fails(luns):
    lun = luns(300 * MIB)
    run("blockdev", "--setro", lun.disk.node)
    assert lun.mount().result == -2
    assert lun.key("volume_state") == "3"
    run("blockdev", "--setrw", lun.disk.node)


def test_an_empty_partition_that_cannot_be_written_becomes_read_only(luns):
    lun = luns(300 * MIB)
    partition(lun)
    run("blockdev", "--setro", lun.disk.part)
    assert lun.mount().result == -3
    assert lun.key("vol_access_right") == "0"
    assert (lun.key("format_state"), lun.key("format_progress")) == ("1", "0")
    assert lun.mount().result == -3, "the semaphore went with the run that kept it"


def test_a_volume_that_cannot_be_written_is_mounted_read_only(luns):
    lun = luns(300 * MIB)
    lun.mount()
    keep_files(lun)
    lun.unmount()
    run("blockdev", "--setro", lun.disk.part)
    assert lun.mount().result == -7
    assert lun.key("vol_access_right") == "0"
    assert lun.mounted()
    assert_files(lun)


def test_a_disk_that_cannot_be_read_is_not_taken_for_an_empty_one(luns):
    lun = luns(300 * MIB)
    lun.disk.resize(0)
    os.truncate(lun.disk.file, 0)  # reads beyond the end of the backing file fail
    assert lun.mount().result == -2
    assert lun.key("volume_state") == "3"
    assert not lun.box.shell()
    assert os.stat(lun.disk.file).st_size == 0


def test_a_partition_that_cannot_be_read_is_not_formatted(luns):
    lun = luns(300 * MIB)
    partition(lun)
    os.truncate(lun.disk.file, MIB + 4096)
    assert lun.mount().result in (-2, -6)
    assert not formatted(lun)
    assert os.stat(lun.disk.file).st_size == MIB + 4096


# --- share names ---

NAMES = [
    "two words", " blank at both ends ", "it's", 'say "yes"', "$HOME", "$(touch /tmp/broken-out)",
    "`touch /tmp/broken-out`", "back\\slash", "\\", "a;touch /tmp/broken-out", "a&b|c>d<e", "*?[a]", "#!~%",
    "ümläut 名前", "-rf", "--", "-", "...", "..x", "x" * 120, "$`\"\\" * 30, "new\nline", "tab\tstop", "a/b", "./c",
    "".join(c for c in string.printable if c != "/"), "\x01\x1b[31m\x7f", "\udcff\udc80", "a\\040b",
]


@pytest.mark.parametrize("name", NAMES, ids=range(len(NAMES)))
def test_any_share_name(luns, name):
    lun = luns(64 * MIB, name)
    box = lun.box
    bystander = box.write("/mnt/VV/bystander", "stays")
    assert lun.mount().result == 0
    assert os.path.normpath(lun.mount_point) in lun.mounts()
    assert lun.key("mnt") == lun.mount_point
    keep_files(lun)
    assert lun.unmount().result == 0
    assert_gone(lun)
    assert lun.mount().result == 0
    assert_files(lun)
    assert lun.unmount().result == 0
    assert not box.path("/tmp/broken-out").exists()
    assert bystander.read_text() == "stays"


@pytest.mark.parametrize("name", ["..", "../../etc", "a/../..", "/", ".", "../VV", "a/.."])
def test_a_share_name_that_leads_out_is_refused(luns, name):
    lun = luns(64 * MIB, name)
    kept = lun.box.write("/mnt/VV/kept", "stays")
    before = lun.disk.digest()
    assert lun.mount().result == -4
    assert lun.unmount().result == -1
    assert not lun.box.shell()
    assert lun.disk.digest() == before
    assert kept.read_text() == "stays"


# --- the folder below a mount ---

WRITER = """
import itertools, os
kept = open("/tmp/acknowledged", "w", buffering=1)
for number in itertools.count():
    name = f"file{number}"
    try:
        fd = os.open("/mnt/VV/share1/" + name, os.O_CREAT | os.O_EXCL | os.O_WRONLY)
        os.write(fd, b"x")
        os.fsync(fd)
        os.close(fd)
    except OSError:
        continue
    print(name, file=kept)
"""
ROUNDS = int(os.environ.get("REMVOL_ROUNDS", "10"))


@pytest.fixture
def ext4_root(luns):
    """The mount root on an ext4 of its own, as on a machine."""
    lun = luns(300 * MIB)
    root = Loop(lun.disk.file.parent / "root", 64 * MIB)
    make_ext(root)
    lun.box.path("/mnt/VV").mkdir(exist_ok=True)
    assert lun.box.run(["/usr/bin/mount", root.node, "/mnt/VV"]).status == 0
    yield lun
    lun.box.run(["/bin/sh", "-c", "kill -9 -1"])
    for path in [*reversed(lun.mounts()), "/mnt/VV"]:
        lun.box.run(["/usr/bin/umount", "-l", path])
    root.close()


def immutable(lun, path):
    return "i" in lun.box.run(["/usr/bin/lsattr", "-d", path]).stdout.split()[0]


def test_files_written_while_a_volume_comes_and_goes_are_on_the_volume(ext4_root):
    """A root writer beside unmount and mount: what it was told is kept was kept."""
    lun = ext4_root
    lun.mount()
    lun.box.fake("fuser", first=True)  # nobody is killed
    writer = lun.box.start(["/usr/bin/python3", "-c", WRITER], env={"LD_PRELOAD": None})
    acknowledged = lun.box.path("/tmp/acknowledged")
    lun.box.wait_until(lambda: acknowledged.exists() and acknowledged.stat().st_size > 100)
    for _ in range(ROUNDS):
        before = acknowledged.stat().st_size
        assert lun.unmount().result == 0
        assert lun.mount().result == 0
        lun.box.wait_until(lambda: acknowledged.stat().st_size > before)
    writer.kill()
    writer.wait()
    names = set(acknowledged.read_text().split())
    print(f"{ROUNDS} rounds, {len(names)} files, lost {len(names - set(os.listdir(lun.path())))}")
    assert names <= set(os.listdir(lun.path()))
    assert lun.unmount().result == 0
    assert left_below_root(lun) == ["lost+found"]


def left_below_root(lun):
    """What the mount root holds, and what is mounted in it."""
    mounts = open(f"/proc/{lun.box.pid}/mounts", encoding="utf-8").read().splitlines()
    return sorted(os.listdir(lun.box.path("/mnt/VV"))) + [line for line in mounts if " /mnt/VV/" in line]


@pytest.mark.parametrize("seed", range(4))
def test_a_run_that_is_killed_anywhere_leaves_a_folder_that_is_used_again(ext4_root, seed):
    lun = ext4_root
    lun.mount()
    keep_files(lun)
    moments = random.Random(seed)
    for number in range(12):
        operation = ["unmount", "1", "1"] if number % 2 == 0 else ["mount", "1", "1", "0", "0"]
        run_to_kill = lun.box.start([str(lun.box.tools / "volume_driver"), *operation])
        lun.box.pump(moments.uniform(0, 0.06))
        run_to_kill.kill()
        run_to_kill.wait()
        lun.box.wait_quiet()
        if number % 3 == 2:
            assert lun.mount().result == 0
            assert_files(lun)
    assert lun.mount().result == 0
    assert_files(lun)
    assert lun.unmount().result == 0
    assert left_below_root(lun) == ["lost+found"]


def test_a_full_system_disk_holds_up_no_unmount(ext4_root):
    lun = ext4_root
    lun.mount()
    keep_files(lun)
    filler = lun.box.path("/mnt/VV/filler")
    with pytest.raises(OSError), open(filler, "wb", buffering=0) as file:
        while True:
            file.write(b"x" * MIB)
    assert lun.unmount().result == 0
    assert left_below_root(lun) == ["filler", "lost+found"]
    assert lun.mount().result in (0, -4), "a small folder may find its room"
    filler.unlink()
    assert lun.mount().result == 0
    assert_files(lun)


@pytest.mark.parametrize("share", ["share1", "a/share1"])
def test_a_planted_link_is_not_followed(luns, share):
    lun = luns(64 * MIB, share)
    kept = lun.box.write("/tmp/elsewhere/share1/kept", "stays")
    before = lun.disk.digest()
    link = lun.box.path("/mnt/VV/" + share.split("/")[0])
    link.parent.mkdir(exist_ok=True)
    link.symlink_to("/tmp/elsewhere" if "/" in share else "/tmp/elsewhere/share1")
    assert lun.mount().result == -4
    assert lun.unmount().result == -1
    assert not lun.box.shell()
    assert lun.disk.digest() == before
    assert kept.read_text() == "stays"


def lead_elsewhere(name):
    """Shell text of somebody who may write in the volume "outer": NAME in it leads elsewhere from now on."""
    return f"cd /mnt/VV/outer; [ ! -e {name} ] || mv {name} was; ln -s /mnt/elsewhere {name}"


def test_a_link_that_is_planted_during_a_format_is_not_followed(luns):
    outer, inner = luns(300 * MIB, "outer"), luns(200 * MIB, "outer/inner")
    outer.mount()
    outer.box.write("/mnt/elsewhere/kept", "stays")
    outer.box.hook("semop", "-1 SEM_UNDO", through=True, effect=lead_elsewhere("inner"))
    done = inner.mount()
    assert done.result == -4
    assert "share name outer/inner leads through a symbolic link below /mnt/VV/" in messages(done, "Target_mount")
    assert formatted(inner) and not inner.mounts()


REMOUNT, KILL, UMOUNT = (command + ' "/mnt/VV/outer/x/inner"' for command in ("mount -o remount", "fuser -mk", "umount -f"))


@pytest.mark.parametrize("in_use", [False, True])
@pytest.mark.parametrize("function, what, done", [("system", "fuser -mk ", []), ("sleep", "1", [REMOUNT, KILL]),
                                                  ("system", UMOUNT, [REMOUNT, KILL, UMOUNT])])
def test_a_link_that_is_planted_during_an_unmount_is_not_followed(luns, function, what, done, in_use):
    outer, inner = luns(300 * MIB, "outer"), luns(200 * MIB, "outer/x/inner")
    box = outer.box
    outer.mount()
    inner.mount()
    if in_use:
        box.path("/mnt/elsewhere/inner").mkdir(parents=True)
        assert box.run(["/usr/bin/mount", "-t", "tmpfs", "none", "/mnt/elsewhere/inner"]).status == 0
    kept = box.write("/mnt/elsewhere/inner/kept", "stays")
    box.forget()
    box.fake("fuser", first=True)  # without users the real one fails and is tried again
    box.hook(function, startswith(what), times=1, through=what != UMOUNT, ret=256, effect=lead_elsewhere("x"))
    unmount = inner.unmount()
    assert unmount.result == -1
    assert "share name outer/x/inner leads through a symbolic link below /mnt/VV/" in messages(unmount)
    assert [line for line in box.shell() if inner.mount_point in line] == done
    assert kept.read_text() == "stays"


def test_a_link_that_is_planted_while_a_mount_fails_is_not_removed_through(luns):
    lun = luns(64 * MIB, "a/share1")
    kept = lun.box.write("/mnt/elsewhere/share1/kept", "stays")
    lun.box.fake("mount", "-t ext4", first=True, status=32, times=1,
                 effect="cd /mnt/VV; mv a was; ln -s /mnt/elsewhere a")
    lun.box.fake("mount", "-t ext4", first=True, skip=1, status=32)
    done = lun.mount()
    assert (done.result, lun.key("volume_state")) == (0, "3")
    assert "share name a/share1 leads through a symbolic link below /mnt/VV/" in messages(done)
    assert kept.read_text() == "stays"


def test_a_bare_folder_takes_nothing(ext4_root):
    lun = ext4_root
    lun.box.fake("mount", "-t ext4", first=True,
                 effect=f'touch "{lun.mount_point}/stray" && touch /tmp/stray; mount "$@"')
    assert lun.mount().result == 0
    assert not immutable(lun, lun.mount_point), "not the root of the volume"
    lun.box.run(["/usr/bin/umount", lun.mount_point])
    assert immutable(lun, lun.mount_point)
    assert lun.box.run(["/usr/bin/touch", f"{lun.mount_point}/stray"]).status != 0
    assert not lun.box.path("/tmp/stray").exists()
    assert lun.mount().result == 0, "used again"
    assert lun.unmount().result == 0
    assert_gone(lun)


# --- volumes in use ---

USERS = {
    "open file": "import time; f = open('a file'); print('ready', flush=True); time.sleep(600)",
    "working folder": "import os, time; os.chdir('.'); print('ready', flush=True); time.sleep(600)",
    "mapping": "import mmap, os, time; fd = os.open('a file', os.O_RDONLY); m = mmap.mmap(fd, 0, prot=mmap.PROT_READ);"
               "os.close(fd); os.chdir('/'); print('ready', flush=True); time.sleep(600)",
}


def use(lun, code, folder=None):
    user = lun.box.start(["/usr/bin/python3", "-c", code], cwd=folder or lun.mount_point, env={"LD_PRELOAD": None})
    lun.box.wait_until(lambda: "ready" in user.stdout)
    return user


@pytest.mark.parametrize("kind", USERS)
def test_the_users_of_a_volume_are_killed(luns, kind):
    lun = luns(300 * MIB)
    lun.mount()
    keep_files(lun)
    user = use(lun, USERS[kind])
    assert lun.unmount().result == 0
    assert user.wait().status == -signal.SIGKILL
    assert_gone(lun)
    assert lun.mount().result == 0
    assert_files(lun)


def test_nobody_else_is_killed(luns):
    lun = luns(300 * MIB)
    lun.mount()
    other = lun.box.start(["/usr/bin/python3", "-c", "import time; time.sleep(600)"], cwd="/tmp")
    assert lun.unmount().result == 0
    assert other.result is None and lun.box.pump(0.05) is False
    lun.box.path("/mnt/VV/share1").mkdir()
    assert lun.unmount().result == 0
    assert other.result is None and lun.box.pump(0.05) is False
    other.kill()


@pytest.mark.parametrize("kind", USERS)
def test_a_volume_that_stays_in_use_loses_no_file(luns, kind):
    """The kill does not reach the user: the volume is detached before the mount point is removed."""
    lun = luns(300 * MIB)
    lun.mount()
    keep_files(lun)
    lun.box.fake("fuser", first=True)
    user = use(lun, USERS[kind])
    lun.box.forget()
    assert lun.unmount().result == 0
    assert len(lun.box.runs("umount")) == 4
    assert_gone(lun)
    assert user.result is None
    user.kill()
    user.wait()
    assert lun.mount().result == 0
    assert_files(lun)


def test_a_volume_mounted_twice_on_its_mount_point(luns):
    lun = luns(300 * MIB)
    lun.mount()
    keep_files(lun)
    assert lun.box.run(["/usr/bin/mount", "--bind", lun.mount_point, lun.mount_point]).status == 0
    assert lun.mounts() == 2 * [lun.mount_point]
    lun.box.fake("fuser", first=True)
    user = use(lun, USERS["open file"])
    assert lun.unmount().result == 0
    assert_gone(lun)
    user.kill()
    user.wait()
    assert lun.mount().result == 0
    assert_files(lun)


def test_the_mount_in_the_ftp_area(luns):
    lun = luns(300 * MIB, "Data")
    lun.mount()
    keep_files(lun)
    assert lun.call("ftp_path").result == -104
    ftp = "/home/Public/the \"Data\" $x"
    lun.box.path(ftp).mkdir(parents=True)
    assert lun.box.run(["/usr/bin/mount", lun.disk.part, ftp]).status == 0
    done = lun.call("ftp_path")
    assert (done.result, f"path = {ftp}" in done.lines) == (0, True)
    assert lun.unmount().result == 0
    assert lun.mounts() == [ftp], "the volume's files are safe behind the other mount"
    user = use(lun, USERS["open file"], ftp)
    # The kill is not waited for; here nobody is left when it returns.
    lun.box.fake("fuser", effect='fuser "$@"; while fuser -s -m "$2"; do sleep 0.01; done', first=True)
    assert drive(lun.box, "unmount_ftp", ftp).result == 0
    assert user.wait().status == -signal.SIGKILL
    assert not lun.mounts()
    assert lun.box.path(ftp).is_dir()
    assert lun.mount().result == 0
    assert_files(lun)


def test_a_volume_below_another_keeps_its_files(luns):
    """It is detached with the one above it."""
    outer, inner = luns(300 * MIB, "outer"), luns(200 * MIB, "outer/inner")
    outer.mount()
    inner.mount()
    keep_files(outer)
    keep_files(inner)
    assert outer.unmount().result == 0
    assert_gone(outer)
    assert outer.mount().result == 0
    assert inner.mount().result == 0
    assert_files(outer)
    assert_files(inner)


def test_a_volume_below_a_folder_is_in_the_way_of_its_removal(luns):
    outer, inner = luns(300 * MIB, "outer"), luns(200 * MIB, "outer/inner")
    inner.mount()
    keep_files(inner)
    assert outer.unmount().result == -1
    assert inner.mounted()
    assert_files(inner)


# --- volumes that turned read-only ---


def degraded(lun):
    return drive(lun.box, "degraded", lun.disk.part, lun.mount_point).result


def test_a_volume_that_is_fine_is_not_degraded(luns):
    lun = luns(300 * MIB)
    lun.mount()
    assert degraded(lun) == 0
    assert os.listdir(lun.path()) == ["lost+found"]


def test_a_volume_whose_journal_was_aborted_is_degraded(luns):
    lun = luns(300 * MIB)
    lun.mount()
    lun.box.run(["/usr/bin/mount", "-o", "remount,abort", lun.mount_point])
    assert lun.box.run(["touch", f"{lun.mount_point}/x"]).status != 0
    assert degraded(lun) == 1
    assert lun.unmount().result == 0
    assert lun.mount().result == 0
    assert degraded(lun) == 0, "a new mount helps"


def test_a_degraded_volume_that_is_mounted_still_is_not_called_writable(luns):
    """On kernels 6.1.192, 6.12 and 6.13 the chmod goes through, in memory alone."""
    lun = luns(300 * MIB)
    lun.mount()
    lun.box.run(["/usr/bin/mount", "-o", "remount,abort", lun.mount_point])
    lun.box.fake("chmod", "777", first=True)
    assert lun.mount().result == -7
    assert (lun.key("volume_state"), lun.key("vol_access_right")) == ("0", "0")
    assert lun.unmount().result == 0
    assert_gone(lun)
    assert lun.mount().result == 0
    assert lun.key("vol_access_right") == "1"


def test_a_volume_that_was_mounted_read_only_is_not_degraded(luns):
    lun = luns(300 * MIB)
    lun.mount()
    lun.unmount()
    lun.box.path(lun.mount_point).mkdir()
    lun.box.run(["/usr/bin/mount", "-o", "ro", lun.disk.part, lun.mount_point])
    assert degraded(lun) == 0
    lun.box.run(["/usr/bin/umount", lun.mount_point])
    assert degraded(lun) == -1
