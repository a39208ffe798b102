"""Records that a box gives to a test: what a program answered, what was called, what a rule fits."""

import re
from dataclasses import dataclass


@dataclass
class Result:
    """What a program left: status is the exit status, or minus the number of the signal that ended it."""

    status: int
    stdout: str
    stderr: str

    @property
    def lines(self):
        return self.stdout.splitlines()


@dataclass
class Call:
    """One line of the log."""

    kind: str
    pid: int
    fields: list

    def __str__(self):
        if self.kind == "set":
            return f"set {self.fields[0]}={self.fields[1]}"
        if self.kind in ("run", "unscripted"):
            return " ".join([self.kind, self.fields[0], *self.fields[3:]])
        if self.kind in ("popen", "getaddrinfo", "del", "dump"):
            return f"{self.kind} {self.fields[0]}"
        return " ".join([self.kind, *self.fields]).rstrip()


class Arguments(list):
    """The arguments of one call of a fake command."""

    def __init__(self, call):
        super().__init__(call.fields[3:])
        self.shell = call.fields[1]
        self.lc_all = call.fields[2]


def startswith(text):
    """A subject for a hook: fits every subject that begins with `text`."""
    return ("prefix", text)


def matcher(pattern, words):
    """How the rule's text is compared, and the text."""
    if pattern is None:
        return "any", ""
    if isinstance(pattern, tuple):
        return pattern
    if isinstance(pattern, re.Pattern):
        return "regex", pattern.pattern
    return words, pattern


def escape(text):
    raw = text if isinstance(text, bytes) else str(text).encode("utf-8", "surrogateescape")
    return "".join(chr(b) if 0x20 <= b <= 0x7E and b != 0x5C else f"\\x{b:02x}" for b in raw)


def unescape(text):
    raw = re.sub(rb"\\x([0-9a-fA-F]{2})", lambda m: bytes([int(m[1], 16)]), text.encode("latin-1"))
    return raw.decode("utf-8", "surrogateescape")
