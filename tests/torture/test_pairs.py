"""Pairs of commands that were seen, or could be feared, to harm each other. TORTURE_ROUNDS sets the rounds of each."""

import os
import pathlib

import pytest

from pairs import PAIRS, torment

ROUNDS = int(os.environ.get("TORTURE_ROUNDS", "3"))
STORIES = os.environ.get("TORTURE_STORIES")


@pytest.mark.parametrize("name", PAIRS)
def test_two_commands_do_each_other_no_harm(name):
    bad = torment(PAIRS[name], rounds=ROUNDS, stories=pathlib.Path(STORIES) / name if STORIES else None)
    assert not bad, "\n".join(f"{distance:+} s: {text}" for distance, texts in bad.items() for text in texts)
