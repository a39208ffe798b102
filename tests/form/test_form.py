"""What scripts/check-format says of the sources: includes in circles or upward, and functions that are too long."""

import pathlib
import re
import subprocess

import pytest

TOP = pathlib.Path(__file__).resolve().parents[2]
CLEAN = {
    "include/layout.h": "",
    "platform/include/library.h": '#include "layout.h"',
    "platform/tool/tool.cpp": '#include "library.h"',
    "src/frontend/log.h": "",
    "src/support/files.h": '#include "frontend/log.h"',
    "src/tree/keys.h": '#include "layout.h"\n#include "support/files.h"',
    "src/iscsi/node.cpp": '#include "iscsi/node.h"\n#include "tree/keys.h"\n#include "library.h"',
    "src/iscsi/node.h": "#include <cstdio>",
    "src/volume/mount.h": '#include "tree/keys.h"',
    "src/tasks/add.cpp": '#include "iscsi/node.h"\n#include "volume/mount.h"',
    "src/frontend/main.cpp": '#include "frontend/log.h"\n#include "tree/keys.h"',
}


def checked(folder, files):
    """What the check says of the clean sources with these files in place of some, line by line."""
    for name, text in {**CLEAN, **files}.items():
        path = folder / name
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_text(text + "\n")
    done = subprocess.run([TOP / "scripts/check-includes", folder], stderr=subprocess.PIPE, text=True)
    assert done.returncode == (1 if done.stderr else 0)
    return done.stderr.splitlines()


def test_clean_sources(tmp_path):
    assert checked(tmp_path, {}) == []


def test_no_sources_at_all_are_no_success(tmp_path):
    done = subprocess.run([TOP / "scripts/check-includes", tmp_path], stderr=subprocess.PIPE, text=True)
    assert (done.returncode, done.stderr) == (1, f"{tmp_path} has no sources\n")


CIRCLES = {
    "two headers": {"src/tree/keys.h": '#include "tree/state.h"', "src/tree/state.h": '#include "tree/keys.h"'},
    "two sources": {"src/tree/keys.cpp": '#include "tree/state.h"', "src/tree/state.cpp": '#include "tree/keys.h"', "src/tree/state.h": ""},
    "in the platform": {"platform/tool/tool.h": '#include "tool/other.h"', "platform/tool/other.cpp": '#include "tool/tool.h"', "platform/tool/other.h": ""},
    "around a corner": {"src/tree/keys.h": '#include "tree/state.h"', "src/tree/state.h": '  #  include "tree/entry.h"', "src/tree/entry.h": '#include "tree/keys.h"'},
}


@pytest.mark.parametrize("files", CIRCLES.values(), ids=CIRCLES)
def test_a_circle(tmp_path, files):
    complaint, = checked(tmp_path, files)
    names = complaint.removeprefix("a circle: ").split(" includes ")
    assert names[0] == names[-1] and len(names) == len({name.rpartition(".")[0] for name in files}) + 1


@pytest.mark.parametrize("path, name, complaint", [
    ("src/frontend/log.cpp", "support/net.h", "src/frontend/log includes src/support/net of a floor above"),
    ("src/support/ping.cpp", "tree/keys.h", "src/support/ping includes src/tree/keys of a floor above"),
    ("src/tree/state.cpp", "iscsi/node.h", "src/tree/state includes src/iscsi/node of a floor above"),
    ("src/iscsi/address.cpp", "volume/mount.h", "src/iscsi/address includes src/volume/mount beside it"),
    ("src/volume/device.cpp", "iscsi/node.h", "src/volume/device includes src/iscsi/node beside it"),
    ("src/volume/device.h", "tasks/add.h", "src/volume/device includes src/tasks/add of a floor above"),
    ("src/tasks/remove.cpp", "frontend/options.h", "src/tasks/remove includes src/frontend/options of a floor above"),
    ("src/tree/state.cpp", "state.h", "src/tree/state.cpp: there is no state.h that it may know"),
    ("platform/tool/other.cpp", "tree/keys.h", "platform/tool/other.cpp: there is no tree/keys.h that it may know"),
    ("src/tree/state.cpp", "tool/tool.h", "src/tree/state.cpp: there is no tool/tool.h that it may know"),
])
def test_an_include_that_is_not_from_below(tmp_path, path, name, complaint):
    there = {"src/support/net.h": "", "src/tasks/add.h": "", "src/frontend/options.h": "", "src/tree/state.h": "", "platform/tool/tool.h": ""}
    assert checked(tmp_path, {**there, path: f'#include "{name}"'}) == [complaint]


def test_an_include_of_ours_between_angles(tmp_path):
    assert checked(tmp_path, {"src/tree/state.cpp": "#include <tree/keys.h>"}) == ["src/tree/state.cpp: tree/keys.h is ours and belongs between quotes"]


@pytest.mark.parametrize("lines, too_long", [(80, False), (81, True)])
def test_a_long_function(tmp_path, lines, too_long):
    (tmp_path / ".clang-tidy").write_text((TOP / ".clang-tidy").read_text())
    source = tmp_path / "long.cpp"
    source.write_text("\n".join(["int sum(int x) {", *["  x += 1;"] * (lines - 3), "  return x;", "}", ""]))
    done = subprocess.run(["clang-tidy", "--quiet", source, "--"], stdout=subprocess.PIPE, stderr=subprocess.PIPE, text=True)
    assert bool(re.search(r"function 'sum' exceeds .*readability-function-size", done.stdout)) == too_long
    assert done.returncode == int(too_long)
