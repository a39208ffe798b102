"""The documents of this repository, the blocks in them, and the schemas."""

import json
import pathlib
import re

TOP = pathlib.Path(__file__).resolve().parents[3]
PAGES = sorted(path for path in (TOP / "docs/man").iterdir() if not path.read_text().startswith(".so "))


def published_schema(name):
    """The schema as it is installed: it lets members pass that a later version adds."""
    return json.loads((TOP / "docs" / name).read_text())


def strict_schema(name):
    """The same for what this version prints: it has no member that is not described."""
    def strict(part):
        if isinstance(part, list):
            return [strict(each) for each in part]
        if not isinstance(part, dict):
            return part
        closed = {"additionalProperties": False} if "properties" in part else {}
        return {**{key: strict(value) for key, value in part.items()}, **closed}

    return strict(published_schema(name))


def plain(page_text):
    """The text of a manual page without its escapes."""
    return re.sub(r"\\(.)", lambda escape: {"e": "\\"}.get(escape[1], escape[1]), page_text)


def blocks_of(path):
    """The blocks of a document or manual page, as a person sees them."""
    text = path.read_text()
    if path in PAGES:
        return re.findall(r"^\.EX\n(.*?)^\.EE$", plain(text), re.M | re.S)
    return re.findall(r"^```\w*\n(.*?)^```$", text, re.M | re.S)
