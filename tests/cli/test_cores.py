"""Programs that have values of the tree, or settings, in their memory leave no core."""

import pytest

# What they are kept busy with: a program that they wait for is a fake that takes its time.
PROGRAMS = {
    "ktreec": ["-S", "/var/run/ktree_sock_vv", "-t"],
    "remvol-events": [],
    "remvol-keeper": [],
    "remvol-notify": ["--test"],
    "winshare_reload": [],
    "macshare_reload": [],
    "flashrun": ["sleep 1000"],
    "vvstat": ["--json", "--watch"],
}
SLOW = ["smbcontrol", "killall"]


def cores(box):
    return list(box.path("/tmp").glob("core*"))


def run(box, program, *words):
    assert box.run([f"/usr/bin/{program}", *words], env={"LD_PRELOAD": None}).status == 0


def dies_of_an_abort(box, *words):
    """Its status, when it is killed while it sleeps with leave to write a core."""
    unlimited = ["sh", "-c", 'ulimit -c unlimited; exec "$@"', "sh"]
    running = box.start([*unlimited, *words], env={"LD_PRELOAD": None}, cwd="/tmp")

    def sleeps():
        stat = box.path(f"/proc/{running.pid}/stat").read_text()
        return stat.rpartition(")")[2].split()[0] == "S" and box.processes()[running.pid] == list(map(str, words))

    box.wait_until(sleeps, what=f"{words} being asleep")
    run(box, "kill", "-ABRT", running.pid)
    return running.wait().status


@pytest.fixture
def busy(box):
    if dies_of_an_abort(box, "/bin/sleep", "1000") != -6 or not cores(box):
        pytest.skip("cores go elsewhere on this machine")
    for core in cores(box):
        core.unlink()
    for name in SLOW:
        box.fake(name, delay=1000)
    box.fake("netatalk")
    box.write("/run/samba/smbd.pid", "1\n")
    box.write("/etc/remvol/events.d/1", "#!/bin/sh\nsleep 1000\n", mode=0o755)
    box.tree.set({"/iscsi/initiator/id:1/target": "iqn.t", "/iscsi/initiator/id:1/lun/id:1/lun": "0",
                  "/iscsi/initiator/id:1/lun/id:1/share": "V"})
    for folder in ("/mnt/VV/V", "/usr/local/config"):
        run(box, "mkdir", "-p", folder)
        run(box, "mount", "-t", "tmpfs", "vol", folder)
    return box


@pytest.mark.native
@pytest.mark.parametrize("program, words", PROGRAMS.items(), ids=PROGRAMS)
def test_no_core_is_left(busy, program, words):
    if program == "ktreec":  # its daemon does not answer
        daemon = next(pid for pid, argv in busy.processes().items() if argv[0].endswith("ktree"))
        run(busy, "kill", "-STOP", daemon)
    assert dies_of_an_abort(busy, busy.build / "bin" / program, *words) == -6
    assert cores(busy) == []
