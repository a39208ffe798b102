"""The diagnostic log on a program's standard output, taken apart."""

import re

PREFIX = re.compile(r"^\(([^:()]+):([^:()]+):(\d+)\): (.*)$")


def log_lines(text):
    """The log's lines as (source file, function, message); other output is left out."""
    found = (PREFIX.match(line) for line in text.split("\n"))
    return [(match[1], match[2], match[4]) for match in found if match]


def messages(done, function=None):
    """The messages alone, of one function or of all; `done` is a Result or a text."""
    lines = log_lines(done if isinstance(done, str) else done.stdout)
    return [message for _, origin, message in lines if function in (None, origin)]
