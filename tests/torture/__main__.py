"""scripts/torture: see there."""

import argparse
import collections
import multiprocessing
import pathlib
import random
import re
import sys
import tempfile
import time

sys.path.insert(0, str(pathlib.Path(__file__).parent))

from faults import Faults, Outcomes  # noqa: E402
from many import Round  # noqa: E402
from pairs import PAIRS, torment  # noqa: E402
import disks  # noqa: E402
import fuzz  # noqa: E402
import power  # noqa: E402
import replay  # noqa: E402
import valgrind  # noqa: E402


def kinds(found):
    return ", ".join(f"{kind} {count}" for kind, count in sorted(collections.Counter(f.split(":")[0] for f in found).items()))


def run_many(options):
    seed = options.seed if options.seed is not None else random.SystemRandom().randrange(1 << 30)
    print(f"many: seed {seed}", flush=True)
    begin, bad, number = time.monotonic(), 0, 0
    while number < options.rounds and (options.seconds is None or time.monotonic() - begin < options.seconds):
        this = Round(seed + number, options.runs, not options.no_restarts)
        found = this.play()
        number += 1
        if not found:
            continue
        bad += 1
        print(f"round with seed {this.seed}: {kinds(found)}", flush=True)
        for text in found:
            print(f"  {text}")
        if options.stories:
            folder = pathlib.Path(options.stories)
            folder.mkdir(parents=True, exist_ok=True)
            (folder / f"many-{this.seed}.txt").write_text("\n".join(found) + "\n\n" + this.story)
    seconds = time.monotonic() - begin
    print(f"many: {number - bad} passed, {bad} failed ({number} rounds of {options.runs} runs, {seconds:.0f} s)")
    return bad == 0


def run_pairs(options):
    good = bad = 0
    begin = time.monotonic()
    for name, pair in PAIRS.items():
        if options.only not in name:
            continue
        stories = pathlib.Path(options.stories) / name if options.stories else None
        failing = torment(pair, rounds=options.rounds, seed=options.seed, stories=stories)
        texts = [text for found in failing.values() for text in found]
        print(f"{name}: {len(failing)} of {options.rounds} rounds{': ' + kinds(texts) if texts else ''}", flush=True)
        bad += bool(failing)
        good += not failing
    print(f"pairs: {good} passed, {bad} failed ({options.rounds} rounds each, {time.monotonic() - begin:.0f} s)")
    return bad == 0


def run_faults(options):
    begin = time.monotonic()
    faults = Faults(options.only or (options.at or "").split("/")[0], options.seed, options.jobs, options.system_calls)
    share, shares = options.shard
    chosen = sorted((fault for fault in faults.all
                     if options.at in (None, fault.key()) and re.search(options.named or "", str(fault))
                     and faults.order(fault) % shares == share), key=faults.order)
    results = Results(options.results)
    chosen = [fault for fault in chosen if fault.key() not in results.known][: options.count]
    print(f"faults: {len(faults.all)} are possible on {len(faults.walks)} roads, {len(results.known)} have been tried, "
          f"{len(chosen)} chosen (seed {options.seed})", flush=True)
    with tempfile.TemporaryDirectory(prefix="outcomes.") as folder, \
         multiprocessing.Pool(options.jobs, initializer=keep_faults, initargs=(faults, Outcomes(folder))) as pool:
        for fault, found in pool.imap_unordered(play_fault, chosen):
            results.add(fault, found)
            if options.seconds is not None and time.monotonic() - begin > options.seconds:
                pool.terminate()
                break
        states = len(list(pathlib.Path(folder).iterdir()))
    seconds = time.monotonic() - begin
    good, bad, missed = (results.counts[word] for word in ("passed", "failed", "missed"))
    print(f"faults: {good} passed, {bad} failed ({missed} not met, {states} states, {seconds:.0f} s, {(good + bad) / seconds:.1f} a second)")
    return bad == 0


class Results:
    """What became of each fault, also in a file that a later run goes on with."""

    def __init__(self, path):
        self.file = open(path, "a+") if path else None
        self.known = set()
        self.counts = collections.Counter()
        if self.file:
            self.file.seek(0)
            self.known = {line.split(" ")[1] for line in self.file if not line.startswith(" ")}

    def add(self, fault, found):
        word = "missed" if found is None else "failed" if found else "passed"
        self.counts[word] += 1
        text = "".join("\n    " + text[:1000].replace("\n", "\n    ") for text in found or ())
        if found:
            print(f"{fault.key()} {fault}{text}", flush=True)
        if self.file:
            print(f"{word} {fault.key()} {fault}{text}", file=self.file, flush=True)


def keep_faults(*what):
    global kept
    kept = what


def play_fault(fault):
    faults, outcomes = kept
    try:
        return fault, faults.play(fault, outcomes)
    except Exception as error:  # noqa: BLE001: one bad box does not end a long run
        return fault, [f"torture: {type(error).__name__}: {error}"]


def shard(text):
    share, shares = map(int, text.split("/"))
    return share, shares


def main():
    parser = argparse.ArgumentParser(prog="torture")
    forms = parser.add_subparsers(required=True)
    many = forms.add_parser("many", help="rounds of many runs at once")
    many.add_argument("--rounds", type=int, default=200)
    many.add_argument("--seconds", type=float, help="begin no round after so long")
    many.add_argument("--seed", type=int, help="of the first round; the next has the next number")
    many.add_argument("--runs", type=int, default=64)
    many.add_argument("--no-restarts", action="store_true")
    many.add_argument("--stories", help="folder for the whole story of a round with findings")
    many.set_defaults(run=run_many)
    pairs = forms.add_parser("pairs", help="two commands at every distance from each other")
    pairs.add_argument("--rounds", type=int, default=24, help="of every pair")
    pairs.add_argument("--only", default="", help="pairs whose name contains this")
    pairs.add_argument("--seed", type=int, default=1)
    pairs.add_argument("--stories", help="folder for the whole story of a round with findings")
    pairs.set_defaults(run=run_pairs)
    faults = forms.add_parser("faults", help="every call, command and allocation fails")
    faults.add_argument("--count", type=int, default=50000, help="at most so many, drawn by the seed")
    faults.add_argument("--seconds", type=float, help="begin none after so long")
    faults.add_argument("--only", default="", help="one road")
    faults.add_argument("--at", help="one fault, by its key")
    faults.add_argument("--system-calls", action="store_true", help="those below the C library, by strace")
    faults.add_argument("--named", help="those whose text this expression finds")
    faults.add_argument("--seed", type=int, default=1)
    faults.add_argument("--jobs", type=int, default=2)
    faults.add_argument("--shard", type=shard, default=(0, 1), help="I/N: the I-th of N parts, from 0")
    faults.add_argument("--results", help="file for what became of each; those that stand in it are not tried again")
    faults.set_defaults(run=run_faults)
    disks.add_form(forms)
    fuzz.add_form(forms)
    power.add_form(forms)
    replay.add_form(forms)
    valgrind.add_form(forms)
    options = parser.parse_args()
    sys.exit(0 if options.run(options) else 1)


main()
