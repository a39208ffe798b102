"""scripts/mutate: see there."""

import argparse
import json
import pathlib
import queue
import re
import sys
import threading
import time

HERE = pathlib.Path(__file__).parent
sys.path.insert(0, str(HERE))

from breakages import chosen, stored  # noqa: E402
from copy_of import FOLDER, PROGRAMS, ROOT, Copy  # noqa: E402
from cover import Cover, failing, unit_tests  # noqa: E402

UNIT_LIMIT = 60  # seconds, for tests that take some tenths of one
RESULTS = FOLDER / "results.jsonl"


class Worker:
    """Breaks, builds and tests in a copy of its own."""

    passing = {}  # what a cli test says of the unbroken code, by its name

    def __init__(self, number, cover):
        self.copy, self.cover = Copy(f"worker{number}"), cover

    def prepare(self, targets):
        self.copy.refresh()
        good, output = self.copy.make(*targets, jobs=2)
        if not good:
            raise SystemExit(f"the sources do not build unbroken:\n{output[-3000:]}")

    def try_one(self, breakage, test):
        """Breaks the line and asks test(breakage), which returns (verdict, by): caught, open or uncompiled."""
        place = self.copy.root / breakage.file
        lines = place.read_text().split("\n")
        place.write_text("\n".join([*lines[:breakage.line - 1], breakage.after, *lines[breakage.line:]]))
        try:
            return test(breakage)
        finally:
            place.write_text("\n".join(lines))

    def units(self, breakage):
        units, files = self._tests_of(breakage)
        # The short wait for one unit test that knows the line well saves linking them all.
        for batch in filter(None, (units[:1], units[1:])):
            built, output = self.copy.make(*batch)
            if not built:
                return "uncompiled", re.findall(r"error: .*", output)[:1]
            for name in batch:
                status, _ = self.copy.unit(name, UNIT_LIMIT)
                if status != 0:
                    return "caught", name if status is not None else f"{name} (no end)"
        return ("later" if files else "open"), ""

    def from_outside(self, breakage):
        files = self._tests_of(breakage)[1]
        built, output = self.copy.make(*PROGRAMS)
        if not built:
            return "uncompiled", re.findall(r"error: .*", output)[:1]
        return self._cli(files)

    def _tests_of(self, breakage):
        if self.cover:
            return self.cover.of(breakage)
        return ([t for t in breakage.tests if not t.endswith(".py")], [t for t in breakage.tests if t.endswith(".py")])

    def _cli(self, files):
        ignored = self.cover.failing() if self.cover else []
        limit = 120 + 4 * sum(self.cover.tests[name]["seconds"] for name in files) if self.cover else 300
        while True:
            arguments = ["-x", *(f"--deselect={name}" for name in ignored), *(f"tests/cli/{name}" for name in files)]
            status, output = self.copy.cli(arguments, limit, 2)
            if status is None:
                return "caught", "cli (no end)"
            if status == 0:
                return "open", ""
            found = failing(output)
            if not found:
                return "open", f"pytest said nothing (status {status}): {output[-300:]}"
            # Many tests at once on a busy machine: one that fails alone as well means it.
            again, _ = self.copy.cli(["-x", found[0]], limit, 1)
            if again != 0 and self._passes_unbroken(found[0], limit):
                return "caught", found[0]
            ignored.append(found[0])

    def _passes_unbroken(self, name, limit):
        if name not in self.passing and self.cover:
            self.passing[name] = Copy("cover").cli([name], limit, 1)[0] == 0
        return self.passing.get(name, True)


def must_pass_unbroken(copy, breakages):
    """Ends the run where a test that these name fails by itself: it would seem to notice everything."""
    for name in sorted({test for breakage in breakages for test in breakage.tests}):
        if name.endswith(".py"):
            status, output = copy.cli([f"tests/cli/{name}"], 300, 2)
            # Many tests at once on a busy machine, as with a broken line.
            passes = status == 0 or failing(output) and all(copy.cli([one], 300, 1)[0] == 0 for one in failing(output))
        else:
            status, output = copy.unit(name, UNIT_LIMIT)
            passes = status == 0
        if not passes:
            raise SystemExit(f"{name} fails with nothing broken:\n{output[-3000:]}")


def share_out(workers, breakages, test, done):
    """Every worker takes the next of the breakages."""
    waiting = queue.Queue()
    for breakage in breakages:
        waiting.put(breakage)

    def work(worker):
        while True:
            try:
                breakage = waiting.get_nowait()
            except queue.Empty:
                return
            began = time.monotonic()
            verdict, by = worker.try_one(breakage, getattr(worker, test))
            done(breakage, verdict, by, time.monotonic() - began)

    threads = [threading.Thread(target=work, args=(worker,), daemon=True) for worker in workers]
    for thread in threads:
        thread.start()
    for thread in threads:
        thread.join()


def targets_of(breakages, cover):
    if cover:
        return [*unit_tests(), *PROGRAMS]
    tests = [t for b in breakages for t in b.tests]
    return [*{t for t in tests if not t.endswith(".py")}, *(PROGRAMS if any(t.endswith(".py") for t in tests) else ())]


def run_all(breakages, options, cover):
    reasons = {b.key(): b.reason for b in stored(HERE / "harmless", ROOT, print)}
    counts = {"caught": 0, "harmless": 0, "open": 0, "uncompiled": 0}
    still_open, later, lock, began = [], [], threading.Lock(), time.monotonic()
    FOLDER.mkdir(parents=True, exist_ok=True)

    def done(breakage, verdict, by, seconds):
        with lock:
            if verdict == "later" and breakage.key() not in reasons:
                later.append(breakage)
                return
            if verdict in ("open", "later") and breakage.key() in reasons:
                verdict, by = "harmless", reasons[breakage.key()]
            counts[verdict] += 1
            if verdict == "open":
                still_open.append(breakage)
            print(f"[{sum(counts.values())}/{len(breakages)}] {verdict}: {breakage}\n  {by} ({seconds:.0f} s)", flush=True)
            with RESULTS.open("a") as file:
                file.write(json.dumps({"key": breakage.key(), "verdict": verdict, "by": by}) + "\n")

    workers = [Worker(n, cover) for n in range(min(options.jobs, len(breakages)))]
    for worker in workers:
        worker.prepare(targets_of(breakages, cover))
    if cover:  # the unbroken programs, for the tests as they are now
        Copy("cover").refresh("tests/cli/")
    else:
        must_pass_unbroken(workers[0].copy, breakages)
    share_out(workers, breakages, "units", done)
    if options.units:
        for breakage in later:
            print(f"left to the cli tests: {breakage}", flush=True)
    else:
        share_out(workers, sorted(later, key=cover.seconds) if cover else later, "from_outside", done)
    for breakage in still_open:
        print(f"no test notices: {breakage}")
    tried = sum(counts.values()) - counts["uncompiled"]
    print(f"{tried} breakages: {counts['caught']} caught by a test, {counts['harmless']} harmless with a reason, "
          f"{counts['open']} open; {counts['uncompiled']} did not compile ({time.monotonic() - began:.0f} s)")
    print(f"mutate: {counts['caught'] + counts['harmless']} passed, {counts['open']} failed")
    return counts["open"] == 0 and tried > 0


def without_verdict(breakages):
    """The ones among them that no test has noticed yet."""
    last = {}
    for line in RESULTS.read_text().split("\n") if RESULTS.exists() else ():
        if line:
            result = json.loads(line)
            last[tuple(result["key"])] = result["verdict"]
    return [b for b in breakages if last.get(b.key(), "open") == "open"]


def main():
    parser = argparse.ArgumentParser(prog="scripts/mutate")
    parser.add_argument("--count", type=int, default=200, help="how many breakages (200)")
    parser.add_argument("--seed", type=int, default=1, help="which ones (1)")
    parser.add_argument("--only", default="", help="of the files with this in their names")
    parser.add_argument("--jobs", type=int, default=2, help="so many at once, each in a copy of its own (2)")
    parser.add_argument("--list", action="store_true", help="says which ones, breaks nothing")
    parser.add_argument("--known", action="store_true", help="those of tests/mutate/known, with the tests named there")
    parser.add_argument("--again", action="store_true", help="of the chosen ones those that no test has noticed yet")
    parser.add_argument("--units", action="store_true", help="runs the unit tests alone")
    parser.add_argument("--measure", action="store_true", help="measures which tests run which line, and ends")
    parser.add_argument("--as-measured", action="store_true", help="takes what is measured for good, though tests changed")
    options = parser.parse_args()
    known = stored(HERE / "known", ROOT, sys.exit)
    breakages = known if options.known else known + chosen(ROOT, options.count, options.seed, options.only)
    if options.only:
        breakages = [b for b in breakages if options.only in b.file]
    if options.again:
        breakages = without_verdict(breakages)
    if options.list:
        print("\n".join(map(str, breakages)))
        return True
    cover = None
    if not options.known:
        cover = Cover()
        if options.measure or not options.as_measured:
            cover.measure(2)
    return options.measure or run_all(breakages, options, cover)


if __name__ == "__main__":
    sys.exit(0 if main() else 1)
