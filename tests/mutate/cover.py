"""Which tests run a line: measured with gcov, kept in build/mutate/cover.json, measured anew for changed tests."""

import difflib
import hashlib
import json
import pathlib
import time

from breakages import SCOPE
from copy_of import FOLDER, PROGRAMS, ROOT, Copy, run

STORE = FOLDER / "cover.json"
# The tree's daemon and the children that a box ends by force write no counts: their tests go by name.
BY_NAME = {"platform/ktree/": ("test_ktree", "test_documents", "test_settings_kept"),
           "platform/shares/": ("test_flashrun", "test_shares", "test_settings_kept"),
           "platform/sysaux/": ("test_sysaux",), "platform/events/": ("test_events",),
           "src/volume/bare_folder.cpp": ("test_volume_disks",), "src/volume/cover.cpp": ("test_volume_disks",)}
LONGEST = 900  # seconds for a test file, sixteen times what any takes


def unit_tests():
    return {f"{path.stem}": path for path in sorted((ROOT / "tests/unit").glob("*_test.cpp"))}


def cli_tests():
    return {path.name: path for path in sorted((ROOT / "tests/cli").glob("test_*.py"))}


def stamp(path):
    return hashlib.sha256(path.read_bytes()).hexdigest()[:16]


class Cover:
    """tests: name -> {stamp, seconds, lines: {file: {line: hits}}, failing}; texts: the sources that were measured."""

    def __init__(self):
        stored = json.loads(STORE.read_text()) if STORE.exists() else {}
        self.tests, self.texts = stored.get("tests", {}), stored.get("texts", {})
        self.maps = {}
        self.now = {name: stamp(path) for name, path in {**unit_tests(), **cli_tests()}.items()}

    def measure(self, jobs):
        stale = [name for name, path in {**unit_tests(), **cli_tests()}.items()
                 if self.tests.get(name, {}).get("stamp") != stamp(path)]
        for name in set(self.tests) - set(unit_tests()) - set(cli_tests()):
            del self.tests[name]
        if not stale:
            return
        if len(stale) > 10:
            self.tests, self.texts = {}, {}
        copy = Copy("cover", "-O0 -w --coverage")
        copy.refresh()
        good, output = copy.make(*unit_tests(), *PROGRAMS, jobs=jobs)
        if not good:
            raise SystemExit(f"the build for measuring failed:\n{output[-2000:]}")
        for name in stale if self.tests else [*unit_tests(), *cli_tests()]:
            self.tests[name] = self._one(copy, name, jobs)
            print(f"measured {name} ({self.tests[name]['seconds']:.1f} s)", flush=True)
        for file in SCOPE:
            self.texts.setdefault(file, (ROOT / file).read_text())
        STORE.write_text(json.dumps({"tests": self.tests, "texts": self.texts}))

    def _one(self, copy, name, jobs):
        for path in copy.build.rglob("*.gcda"):
            path.unlink()
        began = time.monotonic()
        if name in unit_tests():
            status, output = copy.unit(name, LONGEST)
            path = unit_tests()[name]
        else:
            status, output = copy.cli([f"tests/cli/{name}"], LONGEST, jobs)
            path = cli_tests()[name]
        seconds = time.monotonic() - began
        return {"stamp": stamp(path), "seconds": seconds, "failing": failing(output), "lines": counts(copy)}

    def of(self, breakage):
        """The unit tests and the cli test files for a breakage, most telling first."""
        line = self._old_line(breakage)
        hits = {name: self._hits(test, breakage.file, line) for name, test in self.tests.items()}
        if not any(hits.values()):  # not code of its own, or run where nothing is counted
            hits = {name: int(breakage.file in test["lines"]) for name, test in self.tests.items()}
        for name, test in self.tests.items():  # one that has changed may know the line by now
            if test["stamp"] != self.now.get(name) and breakage.file in test["lines"]:
                hits[name] = hits[name] or 1
        for start, names in BY_NAME.items():
            if breakage.file.startswith(start):
                hits.update({n: hits[n] or 1 for n in hits if n.endswith(".py") and n.startswith(names)})
        order = sorted((n for n in hits if hits[n] and n in self.now), key=lambda n: self.tests[n]["seconds"] / (1 + hits[n] ** 0.5))
        return [n for n in order if not n.endswith(".py")], [n for n in order if n.endswith(".py")]

    def seconds(self, breakage):
        """What its cli test files take."""
        return sum(self.tests[name]["seconds"] for name in self.of(breakage)[1])

    def _hits(self, test, file, line):
        lines = test["lines"].get(file, {})
        for near in range(line, max(line - 4, 0), -1):  # a statement of several lines counts at its first
            if str(near) in lines:
                return lines[str(near)]
        return 0

    def _old_line(self, breakage):
        """The line's number in the sources that were measured."""
        if breakage.file not in self.maps:
            old, new = self.texts[breakage.file].split("\n"), (ROOT / breakage.file).read_text().split("\n")
            blocks = difflib.SequenceMatcher(None, old, new, autojunk=False).get_matching_blocks()
            self.maps[breakage.file] = {b + i + 1: a + i + 1 for a, b, size in blocks for i in range(size)}
        return self.maps[breakage.file].get(breakage.line, 0)

    def failing(self):
        """The cli tests that failed without any breakage."""
        return [name for test in self.tests.values() for name in test["failing"]]


def failing(output):
    """The names of failed cli tests in pytest's summary."""
    return [line.split(" ", 1)[1].split(" - ")[0].strip() for line in output.split("\n")
            if line.startswith(("FAILED ", "ERROR "))]


def counts(copy):
    """The lines of the code in question that were run, with how often."""
    found = {}
    notes = [str(p) for p in copy.build.rglob("*.gcda") if any(str(p).endswith(name.split("/")[-1] + ".gcda") for name in SCOPE)]
    if not notes:
        return found
    status, output = run(["gcov", "--json-format", "--stdout", *notes], copy.root, 120)
    for text in output.split("\n"):
        if not text.startswith("{"):
            continue
        for file in json.loads(text)["files"]:
            path = pathlib.Path(file["file"])
            name = str(path.relative_to(copy.root)) if path.is_relative_to(copy.root) else file["file"]
            if name in SCOPE:
                lines = found.setdefault(name, {})
                for line in file["lines"]:
                    number = str(line["line_number"])
                    lines[number] = lines.get(number, 0) + line["count"]
    return {name: lines for name, lines in found.items() if any(lines.values())}
