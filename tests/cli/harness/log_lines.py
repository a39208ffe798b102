"""The diagnostic log on standard output, taken apart."""

import re

PREFIX = re.compile(r"^\(([^:()]+):([^:()]+):(\d+)\): (.*)$")


def messages(text):
    """The log's lines as (source file, function, message); other output is left out."""
    found = (PREFIX.match(line) for line in text.split("\n"))
    return [(match[1], match[2], match[4]) for match in found if match]


def said(text):
    """The messages alone."""
    return [message for _, _, message in messages(text)]
