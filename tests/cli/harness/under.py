"""Runs the built programs under another one, such as valgrind: REMVOL_UNDER=valgrind, with REMVOL_UNDER_FOUND a folder for
what it finds. Everything takes many times as long then, so a test may fail for its time; what counts is the folder."""

import os
import pathlib
import re
import shutil

NAME = os.environ.get("REMVOL_UNDER", "")
FOUND = os.environ.get("REMVOL_UNDER_FOUND", "")
SLOWER = 15 if NAME else 5 if "REMVOL_MACHINE" in os.environ else 1
# What the programs start themselves is left alone, but for themselves in the background.
COMMANDS = {
    "": [],
    "valgrind": ["/usr/bin/valgrind", "-q", "--error-exitcode=99", "--leak-check=full", "--errors-for-leak-kinds=definite",
                 "--show-leak-kinds=definite", "--trace-children=yes", "--trace-children-skip=/bin/*,/usr/*,/fake/*,/sbin/*",
                 "--child-silent-after-fork=yes",
                 f"--suppressions={pathlib.Path(__file__).resolve().parents[2] / 'torture/memcheck.supp'}"],
}


def under(argv, build, log):
    """The words that run `argv`, one of the programs of the build, with the other program's messages in log.NUMBER."""
    words = [word if isinstance(word, bytes) else str(word) for word in argv]
    name = words[0].rpartition("/")[2]
    if not NAME or words[0] not in (name, f"{build}/bin/{name}") or not (pathlib.Path(build) / "bin" / name).exists():
        return words
    return [*COMMANDS[NAME], f"--log-file={log}.%p", f"{build}/bin/{name}", *words[1:]]


def without(words):
    """A process's words as they would be without the other program, or without an emulator of another processor."""
    if words and words[0].endswith("-binfmt-P"):
        return words[2:]  # the program as a file, and then as it was called
    if not NAME or not words or words[0] != COMMANDS[NAME][0]:
        return words
    return next(words[i:] for i in range(1, len(words) + 1) if i == len(words) or not words[i].startswith("-"))


# What memcheck says of a system call that it does not know yet, such as pidfd_open(2): it is no finding.
UNKNOWN_CALL = re.compile(rb"--\d+-- (WARNING: unhandled .* syscall: \d+|You may be able to write your own handler\.|"
                          rb"Read the file README_MISSING_SYSCALL_OR_IOCTL\.|Nevertheless we consider this a bug\.  Please report|"
                          rb"it at http://valgrind\.org/support/bug_reports\.html\.)\n")


def keep(logs, test):
    """Puts what was found into the folder."""
    for number, log in enumerate(sorted(logs)):
        if FOUND and UNKNOWN_CALL.sub(b"", log.read_bytes()):
            shutil.copy(log, pathlib.Path(FOUND) / f"{test or 'test'}.{os.getpid()}.{number}".replace("/", "_")[-200:])
