"""The cli tests with the built programs under valgrind's memcheck (harness/under.py). Its findings count alone: what takes ten
times as long may fail a test that waits for something."""

import os
import pathlib
import re
import shutil
import subprocess
import sys
import time

REPOSITORY = pathlib.Path(__file__).resolve().parents[2]
FOUND = REPOSITORY / "build/valgrind"
SPARED = 100  # one test, and one more of so many, may not get through: little was seen of those


def add_form(forms):
    form = forms.add_parser("valgrind", help="the cli tests under memcheck (scripts/install-packages valgrind)")
    form.add_argument("files", nargs="*", help="test files of tests/cli; all of them by default")
    form.add_argument("--only", default="", help="tests whose name this expression of pytest -k chooses")
    form.add_argument("--jobs", type=int, default=4)
    form.set_defaults(run=run)


def run(options):
    if shutil.which("valgrind") is None:
        sys.exit("scripts/torture: valgrind is missing: scripts/install-packages valgrind")
    shutil.rmtree(FOUND, ignore_errors=True)
    FOUND.mkdir(parents=True)
    begin = time.monotonic()
    done = subprocess.run(
        ["/usr/bin/python3", "-m", "pytest", "-n", str(options.jobs), "-q", "--tb=line", "-p", "no:cacheprovider",
         *(["-k", options.only] if options.only else []), *(options.files or ["tests/cli"])],
        cwd=REPOSITORY, env={**os.environ, "REMVOL_UNDER": "valgrind", "REMVOL_UNDER_FOUND": str(FOUND)},
        stdin=subprocess.DEVNULL, stdout=subprocess.PIPE, text=True)
    counts = {word: int(number) for number, word in re.findall(r"(\d+) (passed|failed|error|skipped)", done.stdout[-2000:])}
    tests = sum(counts.values())
    slow = re.findall(r"(?m)^(?:FAILED|ERROR) (\S+)", done.stdout)
    for name in slow:
        print(f"  not through, for its time or because it counts processes: {name}")
    findings = sorted(FOUND.iterdir())
    for finding in findings:
        print(f"{finding.name}:\n{finding.read_text('utf-8', 'replace')}")
    print(f"valgrind: {counts.get('passed', 0)} passed, {len(findings)} failed "
          f"({tests} tests, {len(slow)} not through, {time.monotonic() - begin:.0f} s)")
    too_many = len(slow) > 1 + tests // SPARED
    if too_many:
        print("too many are not through")
    return not findings and not too_many and counts.get("passed", 0) > 0
