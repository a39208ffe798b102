"""No wait of the tool, nor of the libraries that it calls, is missing among those that bench/settled_waits.py names."""

import pathlib
import re
import sys

TOP = pathlib.Path(__file__).resolve().parents[2]
sys.path.insert(0, str(TOP / "bench"))

import settled_waits  # noqa: E402

CALL = re.compile(r"\b(?:sleep|usleep|nanosleep|poll)\((?:[^()]|\([^()]*\))*\)")


def waits_of_sources():
    """Where the sources wait, and by what call; the waits of libktreec are for the tree."""
    sources = [*TOP.glob("src/**/*.cpp"), *TOP.glob("platform/sysaux/*.cpp"), *TOP.glob("platform/ostel/*.cpp")]
    return {(str(source.relative_to(TOP)), call) for source in sources
            for line in source.read_text().splitlines() if not line.lstrip().startswith("//") for call in CALL.findall(line)}


def test_every_wait_is_named():
    named = {(file, wait.call) for wait in settled_waits.SETTLED + settled_waits.LOOKS for file in wait.files}
    assert named == waits_of_sources()


def test_each_settled_wait_says_why_it_stood_and_what_would_do():
    for wait in settled_waits.SETTLED:
        assert wait.name and wait.after and wait.seconds and wait.why and wait.instead, wait.files


def test_a_measured_wait_is_known_by_the_command_before_it():
    known = {("sleep", "fuser -mk \"/mnt/VV/a\""): "users of a volume end",
             ("usleep", "fuser -mk \"/mnt/VV/a\""): "users are ended again",
             ("sleep", "(a child)"): "the tree's daemon starts",
             ("usleep", "mount -t ext4 /dev/sda1 \"/mnt/VV/a\""): "a mount failed",
             ("sleep", "mount -o remount \"/mnt/VV/a\""): "a remount shows",
             ("usleep", "chmod 777 /mnt/VV/a"): "a look"}
    assert {each: settled_waits.name_of(*each) for each in known} == known
