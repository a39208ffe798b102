"""Mount points and the space below them, by the kernel's word and by the mount table."""

import os
import pathlib
import subprocess
import time

import pytest
from harness.sysaux import CALL, MIB, TRACED, call, loop, make_ext, run

__all__ = ["loop"]

# What an older kernel answers, and what a mount that lost its server does.
NO_STATX = ["strace", "-f", "-qq", "-o", "/dev/null", "-e", "trace=statx", "-e", "inject=statx:error=ENOSYS"]
LOST_SERVER = [*NO_STATX[:-1], "inject=statx:error=ENOTCONN"]
WAYS = {"kernel": [], "table": NO_STATX, "lost server": LOST_SERVER}


@pytest.fixture(params=["plain", "a b", 'quo"te $x `y` back\\slash', "tab\tnewline\nend", "ümläut", "x" * 120])
def mounted(request, tmp_path):
    folder = tmp_path / request.param
    folder.mkdir()
    run("mount", "-t", "tmpfs", "-o", "size=16m", "tmpfs", folder)
    yield folder
    subprocess.run(["umount", "-q", folder])


@pytest.mark.parametrize("way", WAYS)
def test_a_mount_point_is_told_from_a_folder(mounted, way):
    (mounted / "inside").mkdir()
    assert call("mount_point", mounted, WAYS[way]) != 0
    assert call("mount_point", mounted / "inside", WAYS[way]) == 0
    assert call("mount_point", mounted.parent, WAYS[way]) == 0
    run("umount", mounted)
    assert call("mount_point", mounted, WAYS[way]) == 0


@pytest.mark.parametrize("way", WAYS)
def test_a_link_and_a_trailing_slash_lead_to_the_mount_point(tmp_path, way):
    link = tmp_path / "link"
    link.symlink_to("/proc")
    for path in ("/proc", "/proc/", "/", link):
        assert call("mount_point", path, WAYS[way]) != 0, path


@pytest.mark.parametrize("way", ["kernel", "table"])
def test_a_folder_bound_to_itself_is_a_mount_point(tmp_path, way):
    run("mount", "--bind", tmp_path, tmp_path)
    try:
        assert call("mount_point", tmp_path, WAYS[way]) != 0
    finally:
        run("umount", tmp_path)
    assert call("mount_point", tmp_path, WAYS[way]) == 0


@pytest.mark.native
def test_what_is_not_there_is_no_mount_point(tmp_path):
    file = tmp_path / "file"
    file.touch()
    for path in ("", "/no/such/path", file, file / "below", "x" * 5000, "/dev/null"):
        for way in WAYS.values():
            assert call("mount_point", path, way) == 0
        assert call("df_info", path)[0] == -1


def test_a_modern_kernel_is_asked_without_a_program_a_table_or_a_module():
    done = subprocess.run(
        ["strace", "-f", "-e", "trace=open,openat,execve", CALL, "mount_point", "/proc"],
        capture_output=True, text=True, env=TRACED,
    )
    assert done.stdout == "1\n"
    assert done.stderr.count("execve(") == 1
    assert "libsysaux.so" in done.stderr
    for needless in ("mounts", "mountinfo", "mtab", "libsysaux_", "libblkid"):
        assert needless not in done.stderr


def test_the_space_of_a_volume_is_in_bytes(loop, tmp_path):
    disk = loop(64 * MIB)
    make_ext(disk)
    folder = tmp_path / "mnt"
    folder.mkdir()
    run("mount", disk.node, folder)
    try:
        before = call("df_info", folder)
        with open(folder / "data", "wb") as file:
            file.write(bytes(10 * MIB))
            os.fsync(file.fileno())
        result, total, used, available = map(int, call("df_info", folder))
        space = os.statvfs(folder)
        assert result == 0
        assert total == space.f_blocks * space.f_frsize
        assert used == (space.f_blocks - space.f_bfree) * space.f_frsize
        assert available == space.f_bavail * space.f_frsize
        assert available < total - used  # blocks are reserved for root
        assert 10 * MIB <= used - int(before[2]) < 11 * MIB
    finally:
        run("umount", folder)
    assert call("df_info", folder) == (-1, "0", "0", "0")


def test_a_folder_below_a_mount_point_has_no_space_of_its_own(mounted):
    (mounted / "inside").mkdir()
    assert int(call("df_info", mounted)[1]) == 16 * MIB
    assert call("df_info", mounted / "inside")[0] == -1


def users_of(folder):
    """Whom fuser(1) would find by an open file."""
    device = os.stat(folder).st_dev
    users = []
    for link in pathlib.Path("/proc").glob("[0-9]*/fd/*"):
        try:
            if link.stat().st_dev == device:
                users.append(link.parts[2])
        except OSError:
            pass
    return users


@pytest.fixture
def asking(mounted):
    """A program in the middle of asking for the space of a volume."""
    log = mounted.with_name("log")
    with subprocess.Popen(["strace", "-qq", "-o", log, "-e", "trace=statfs,fstatfs",
                           "-e", "inject=statfs,fstatfs:delay_enter=1500000", CALL, "df_info", mounted],
                          stdout=subprocess.PIPE, text=True, env=TRACED) as process:
        while not (log.exists() and "statfs(" in log.read_text()):
            assert process.poll() is None
            time.sleep(0.02)
        yield process


@pytest.mark.parametrize("mounted", ["plain"], indirect=True)
def test_whoever_asks_for_the_space_is_no_user_whom_an_unmount_would_end(mounted, asking):
    assert users_of(mounted) == []
    assert int(asking.stdout.read().split()[1]) == 16 * MIB


@pytest.mark.parametrize("mounted", ["plain"], indirect=True)
def test_a_volume_that_goes_while_its_space_is_asked_for_has_none(mounted, asking):
    run("umount", mounted)
    assert asking.stdout.read().split()[0] == "-1"
