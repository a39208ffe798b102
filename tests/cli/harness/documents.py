"""The documents of this repository and the blocks in them."""

import pathlib
import re

TOP = pathlib.Path(__file__).resolve().parents[3]
PAGES = sorted(path for path in (TOP / "docs/man").iterdir() if not path.read_text().startswith(".so "))


def plain(page_text):
    """The text of a manual page without its escapes."""
    return re.sub(r"\\(.)", lambda escape: {"e": "\\"}.get(escape[1], escape[1]), page_text)


def blocks_of(path):
    """The blocks of a document or manual page, as a person sees them."""
    text = path.read_text()
    if path in PAGES:
        return re.findall(r"^\.EX\n(.*?)^\.EE$", plain(text), re.M | re.S)
    return re.findall(r"^```\w*\n(.*?)^```$", text, re.M | re.S)
