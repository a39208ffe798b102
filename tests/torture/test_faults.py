"""What `faults` goes by when it does not walk on from a state twice: everything that a later run may meet is in its digest."""

import pytest

import faults
from pairs import FULL, beginning
from world import INITIATOR, SAVED, SOCKET, World


def begun():
    world = World(daemon=False)
    world.restore(beginning(*FULL)[0])
    world.start_daemon()
    return world


CHANGES = {
    "a value of the tree": lambda world: world.real("ktreec", "-S", SOCKET, "-s", f"{INITIATOR}/id:1/status", "Connecting"),
    "a node of the tree without a value": lambda world: world.real("ktreec", "-S", SOCKET, "-s", "/iscsi/other", ""),
    "the settings file": lambda world: world.box.path(SAVED).write_text("<config>"),
    "a lock file that stays": lambda world: world.box.write("/run/remvol/left", ""),
    "the owner's rights": lambda world: world.box.path(SAVED).chmod(0o640),
    "a file anywhere": lambda world: world.box.write("/opt/left", ""),
    "a file that is gone": lambda world: world.box.path("/etc/services").unlink(),
    "a link": lambda world: world.box.path("/tmp/link").symlink_to("/etc/passwd"),
    "a node of a disk": lambda world: world.box.path("/dev/sdb").unlink(),
    "a file in a volume": lambda world: world.box.write("/mnt/VV/v10/file", ""),
    "a folder that nothing can be put in": lambda world: world.sh("mkdir /mnt/VV/bare && chattr +i /mnt/VV/bare"),
    "a volume that is not mounted": lambda world: world.sh("umount /mnt/VV/v10"),
    "a volume that is mounted twice": lambda world: world.sh("mount --bind /mnt/VV/v10 /mnt/VV/v10"),
    "a volume that turned read-only": lambda world: world.degrade("v10"),
    "a semaphore": lambda world: world.sh("ipcmk -S 1"),
    "a session": lambda world: world.real("iscsiadm", "-m", "node", "-T", "iqn.2026-01.org.example:t1", "--logout"),
    "a process": lambda world: world.box.start(["/bin/sleep", "100"], env={"LD_PRELOAD": None}),
}


def test_the_same_state_has_the_same_digest():
    with begun() as one, begun() as other:
        assert one.lasting() == other.lasting() == one.lasting()


@pytest.mark.parametrize("change", CHANGES)
def test_the_digest_differs_with(change):
    with begun() as world:
        before = world.lasting()
        CHANGES[change](world)
        assert world.lasting() != before


def test_a_file_below_a_volume_is_seen():
    again = "mount -t tmpfs -o size=64k /dev/sdb1 /mnt/VV/v10 && echo 1 0 1 >/mnt/VV/v10/.data"
    with begun() as one, begun() as other:
        one.sh(f"umount /mnt/VV/v10 && {again}")
        other.sh(f"umount /mnt/VV/v10 && touch /mnt/VV/v10/below && {again}")
        assert one.lasting() != other.lasting()


def test_a_writer_that_was_killed_counts_without_its_number():
    from world import HEAD, LUN, TARGET, TARGET_SIZE

    opener = HEAD.size + TARGET_SIZE + TARGET.size + LUN.size - 4
    with begun() as world:
        digests = []
        for number in (0, 4711, 4712):
            world._poke(opener, number)
            digests.append(world.lasting())
    assert digests[0] != digests[1] == digests[2]


def test_one_known_outcome_in_so_many_is_found_again(tmp_path):
    outcomes = faults.Outcomes(tmp_path)
    outcomes.keep("connect", "state", faults.Outcome({"tree": "x"}, ["after: y"]))
    assert outcomes.of("connect", "state") == faults.Outcome({"tree": "x"}, ["after: y"])
    assert outcomes.of("connect", "other") is None and outcomes.of("init", "state") is None
    assert sum(outcomes.due() for _ in range(10 * outcomes.CHECKED)) == 10

