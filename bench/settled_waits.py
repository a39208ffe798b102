"""The waits of the tool and of the libraries it calls, by name. A test holds that none is left out."""

import dataclasses
import re

from figures import number


@dataclasses.dataclass
class Wait:
    """One kind of wait. `after` is what the last command before it looks like, by which a measured wait is known."""
    files: tuple
    call: str  # as the sources have it
    name: str = ""
    after: str = ""
    seconds: float = 0
    each: str = ""  # for what it is so long, and how often
    why: str = ""
    instead: str = ""  # the look at the state that would make it superfluous

    @property
    def length(self):
        return f"{number(self.seconds)} s {self.each}".rstrip()

    def is_it(self, call, command):
        return self.call.startswith(call + "(") and re.search(self.after, command) is not None


# Settled: seen from outside, so they stay as they are.
SETTLED = [
    Wait(("src/iscsi/daemon.cpp",), "sleep(1)", "the tree's daemon starts", r"^\(a child\)", 1, "",
         "a daemon that was started is given a second", "whether its socket takes a connection"),
    Wait(("src/iscsi/result_daemon.cpp",), "sleep(1)", "the daemon of an earlier search ends", r"^kill -SIGTERM", 1, "",
         "the same at its end", "whether its process is gone"),
    Wait(("src/iscsi/settings_daemon.cpp",), "sleep(1)", "the settings are loaded again", r"^ktreec .* -l ", 1, "a try, at most 10",
         "a slow processor has not started the daemon in its second", "whether its socket takes a connection"),
    Wait(("src/tasks/connect.cpp", "src/tasks/whole_target.cpp", "src/tasks/format.cpp"), "sleep(kSettleSeconds)",
         "the disks of a new session", r"^iscsiadm -m session -P3", 1, "a target",
         "the nodes of a new session's disks came late; now the listing in front of it names them as running already",
         "whether their nodes can be read (`sys_check_dev`)"),
    Wait(("src/iscsi/session.cpp",), "usleep(kPollInterval)", "LUNs show", r"^iscsiadm -m (session|node .*--login)",
         0.1, "a look, at most 30", "it waits in front of the first look too", "the look first"),
    Wait(("src/volume/format.cpp",), "sleep(1)", "the beginning was wiped", r"^dd if=/dev/zero", 1, "a format",
         "a slow disk takes what dd wrote; mke2fs, which follows, uses the same cache", "none: dd has ended"),
    Wait(("src/volume/mount_command.cpp",), "usleep(kMountRetryWait)", "a mount failed", r"^mount (?!-o remount)",
         0.5, "a try, at most 3", "a disk that is not ready yet", "mount's exit status, which tells a busy disk from a wrong one"),
    Wait(("src/support/command.cpp",), "usleep(static_cast<useconds_t>(wait))", "users are ended again", r"^fuser -mk",
         0.2, "at most, by chance; at most twice", "fuser fails where nobody uses the volume, as where it could not end all",
         "whether anybody uses it: mostly nobody does"),
    Wait(("src/volume/unmount.cpp",), "sleep(1)", "users of a volume end", r"^fuser -mk", 1, "a volume",
         "processes that were killed have to write and to end", "whether umount succeeds, tried at once"),
    Wait(("src/volume/remount.cpp",), "sleep(static_cast<unsigned>(wait_seconds))", "a remount shows", r"^mount -o remount",
         5, "a volume", "a file system on a slow disk turns read-only late", "the mount table after the remount, or one write"),
    Wait(("src/tasks/recover.cpp",), "sleep(1)", "a format or a resize shows", r"^ps ", 1, "a volume, 2 where one was formatted",
         "between two of its programs the list of processes has neither", "whether the format's lock is held"),
    Wait(("src/tasks/recover.cpp",), "sleep(static_cast<unsigned>(wait_seconds))", "a recovery was put off", r"^$",
         10, "in the background", "a target that is being formatted", "its lock, which can be waited for"),
    Wait(("src/support/locks.cpp",), "usleep(static_cast<useconds_t>(wait))", "the queue of recoveries is in use", r"^$",
         0.1, "at most, by chance; at most 4 times", "two recoveries that begin at once", "a lock that is waited for (F_SETLKW)"),
]

# Looks at a state that end as soon as it is there, and begin without a wait: they cost nothing unless something is amiss or
# another run is at work.
LOOKS = [
    Wait(("src/iscsi/iscsid.cpp", "src/support/run_lock.cpp"), "usleep(kPoll)"),
    Wait(("src/support/target_hold.cpp",), "usleep(kBriefPoll)"),
    Wait(("src/volume/disk_use.cpp",), "usleep(kLookPause)"),
    Wait(("src/tree/settings_file.cpp",), "usleep(kLoadPause)"),
    Wait(("src/volume/format.cpp",), "poll(&said, 1, kFirstWordMs)"),
    Wait(("platform/sysaux/disk_table.cpp",), "nanosleep(&kPause, nullptr)"),
    Wait(("platform/sysaux/disk_table.cpp",), "nanosleep(&kReaction, nullptr)"),
    Wait(("platform/sysaux/partitions.cpp",), "nanosleep(&kPause, nullptr)"),
]


def name_of(call, command):
    """The name of a measured wait, by the call and by the last command before it."""
    return next((wait.name for wait in SETTLED if wait.is_it(call, command)), "a look")
