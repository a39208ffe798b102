"""The test box: a private world in which the built programs run against fake commands.

A test takes the fixture `box` (conftest.py). A box has its own root (the machine's root with a layer in memory
on top: /run, /tmp, /mnt, /root and /dev start empty, /sys/block shows no disk), its own network (loopback
only), IPC, host name and processes, and a running `ktree` on /var/run/ktree_sock_vv. Nothing that happens in
it stays. It is made in some 10 milliseconds.

Three examples:

    def test_a_volume_is_unmounted_before_it_is_removed(box):
        box.tree.set({"/iscsi/initiator/id:1/target": "iqn.t1", "/iscsi/initiator/count": "1"})
        box.fake("iscsiadm", "-m session", stdout="tcp: [1] 10.0.0.1:3260,1 iqn.t1\\n")
        box.fake("umount", status=1, times=1)          # the first call fails,
        box.fake("umount")                             # all others work
        done = box.remvol("--del", "-n", "iqn.t1")
        assert done.status == 0
        assert box.shell()[:2] == ["fuser -mk \\"/mnt/VV/s\\"", "umount -f \\"/mnt/VV/s\\""]
        assert box.tree.get("/result/del") == "0"

    def test_a_refused_write_is_tried_three_times(box):
        box.hook("ktreec_set", "/iscsi/initiator/id:1/status", ret=-1, times=2)
        ...
        assert box.trace("set", "sleep") == ["set /iscsi/initiator/id:1/status=Connected", ...]

    def test_a_volume_is_formatted(box):
        disk = box.disk("sdb", 64 << 20)               # a real loop device behind /dev/sdb of the box
        box.fake("mke2fs", real=True)                  # recorded, then the real program
        box.hook("sys_get_fs_type", "/dev/sdb1", out="ext4", ret=0)   # the platform's answer, made up

Running
    box.remvol(*args)      runs remvol; box.run(argv, input=, env=, cwd=, timeout=) any program. Both give a
                           Result: status (negative: the signal that ended it), stdout, stderr (text), lines.
    box.start(argv)        the same without waiting: a Running with wait(), kill(signal), pid (inside), stdout.
    box.wait_quiet()       waits until nothing but the tree's daemon runs (commands started with & are through).
    box.path(p)            pathlib.Path of the box's file p; box.write(p, text) makes its folders as well.
    box.disk(name, size)   a loop device as /dev/NAME of the box (and in its /sys/block with `sysfs=True`).
    box.session_disk(name, target, lun=0, session=1)   what the box's sysfs says: NAME is this LUN,
    box.local_disk(name)                               or a disk of the machine; neither said: nothing is known
    box.tree               get(path) -> text or None, set(path, value) or set({path: value}), delete(path),
                           dump(path="") -> dict of every value, restart(), stop().

Fake commands: every external command of the tool is a fake, first on PATH (COMMANDS in world.py). Each call
is written down and answered by the first rule that fits and is not used up; no rule: the call fails with
status 99 and the test fails at its end.
    box.fake(name, args, stdout=, stderr=, status=0, times=, skip=, effect=, delay=, kill=, real=, first=)
        args     None: any call; text: the words that the arguments begin with; with exact=True all of them;
                 re.compile(...): a POSIX extended expression, searched (no \\d)
        times    so many calls only; skip: only after so many calls of its kind
        effect   shell text run with the call's arguments and FAKE_N (1 for the first), real commands on
                 PATH, output passed on; its exit status counts unless status= is given
        delay    seconds; kill: signal that the command sends to itself; real: go on as the real program
        first    goes before the rules made earlier
    box.default(name, ...) the same, asked after all others. The defaults made for every box: winshare_reload,
                           macshare_reload and flashrun work and print nothing.
    box.unscripted_ok()    calls without an answer do not fail the test (they still exit 99).

Hooks: box.hook(function, subject, value=, ret=, errno=, out=, through=, times=, skip=, effect=, delay=, kill=,
first=) answers a C function in remvol by the same rules; subject is text (equal), a compiled expression, or
startswith("..."). Functions and subjects (preload.c): system, popen (command), pclose, sleep, usleep (number),
mknod, access (path), strdup, fcntl ("lock", "unlock", "wait"), semget, semctl, semop, getaddrinfo (name; out:
addresses), inet_ntop ("AF_INET"), ktreec_set (path; value=), ktreec_get_wb (path; out), ktreec_del,
ktreec_dump (file), sys_* and LIB_Get_Lan_Link_Speed (first text argument; out). `through=True` only
acts (effect, delay, kill) and lets the real function go on: a way to change the world at a chosen moment.
Sleeps take no time; box.sleep_takes(milliseconds) when something else must get on meanwhile.

The log, in order:
    box.calls              all of it: Call(kind, pid, fields)
    box.trace(*kinds)      as text; kinds default to system, popen, sleep, usleep:
                           "system CMD", "popen CMD", "sleep 1", "usleep 1000", "run iscsiadm -m session",
                           "set PATH=VALUE", "del PATH", "dump FILE", "mknod PATH MODE MAJOR:MINOR",
                           "fcntl lock FILE", "semget ...", "semctl ...", "semop ...", "getaddrinfo NAME",
                           "sys_create_1_partition DEV", "sys_expand_1_partition DEV"
    box.shell()            the command texts given to system and popen
    box.runs(name)         argument lists of the fake command, with .shell (text of the calling shell), .lc_all
    box.forget()           starts a new log

The tool's own log: messages(done) gives the texts of the diagnostic log, messages(done, "task_add") those of one
function, log_lines(done.stdout) every line as (file, function, text); box.debug(2) sets the debug level first.

At its end a test fails for calls without an answer and for reports of the sanitizers (box.leaks_unchecked() when it
takes /proc away, which the leak check needs; a test marked `unsanitized` is left out of sanitized builds). A program that outlives
its time limit (20 s) is killed and raises.
"""

from .log_lines import log_lines, messages
from .result import Call, Result, startswith
from .world import Box, build_folder, machine_folder

__all__ = ["Box", "Call", "Result", "build_folder", "log_lines", "machine_folder", "messages", "startswith"]
