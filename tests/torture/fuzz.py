"""Every fuzz target for a long time, some beside each other; what each covers is at the top of tests/fuzz/NAME_fuzz.cpp."""

import os
import pathlib
import re
import subprocess
import time
from concurrent.futures import ThreadPoolExecutor

REPOSITORY = pathlib.Path(__file__).resolve().parents[2]
SOURCES = REPOSITORY / "tests/fuzz"
ENOUGH = 1000  # executions a second of a processor: a target that is slower finds little in its time
WARM = 60  # seconds after which a rate says something: a short run reads the cases of old alone
# Freed memory that is kept for the sanitizer's reports costs more than the parsers when there is much of it.
ENVIRONMENT = {**os.environ, "ASAN_OPTIONS": "quarantine_size_mb=16"}


def add_form(forms):
    form = forms.add_parser("fuzz", help="every fuzz target for a long time (scripts/test clang builds them)")
    form.add_argument("--seconds", type=int, default=600, help="for each target")
    form.add_argument("--jobs", type=int, default=2)
    form.add_argument("--only", default="", help="targets whose name this expression finds")
    form.add_argument("--build", type=pathlib.Path, default=REPOSITORY / "build/clang/tests/fuzz")
    form.set_defaults(run=run)


def run(options):
    names = [source.stem for source in sorted(SOURCES.glob("*_fuzz.cpp")) if re.search(options.only, source.stem)]
    begin = time.monotonic()
    with ThreadPoolExecutor(options.jobs) as pool:
        ended = dict(zip(names, pool.map(lambda name: fuzz(name, options), names)))
    good = sum(is_good for is_good, _ in ended.values())
    slowest = min(ended, key=lambda name: ended[name][1], default="")
    print(f"fuzz: {good} passed, {len(ended) - good} failed ({options.seconds} s each, {time.monotonic() - begin:.0f} s"
          + (f"; slowest {slowest}, {ended[slowest][1]:.0f} a second of a processor" if slowest else "") + ")")
    return good == len(ended) > 0


def fuzz(name, options):
    """Runs one target; what it finds lies in build/fuzz, and belongs into tests/fuzz/corpus once it is mended. Returns whether
    nothing was found in enough executions, and their rate."""
    found = REPOSITORY / "build/fuzz" / name
    found.mkdir(parents=True, exist_ok=True)
    seeds = SOURCES / "corpus" / name
    corpora = [found, *([seeds] if seeds.exists() else [])]
    process = subprocess.Popen(
        [options.build / name, f"-max_total_time={options.seconds}", "-timeout=10", "-rss_limit_mb=2048",
         "-print_final_stats=1", f"-artifact_prefix={found.parent}/", *corpora],
        stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL, stderr=subprocess.PIPE, env=ENVIRONMENT, cwd=found.parent)
    text = process.stderr.read().decode("utf-8", "replace")
    _, status, used = os.wait4(process.pid, 0)
    process.returncode = os.waitstatus_to_exitcode(status)
    stats = {key: int(value) for key, value in re.findall(r"stat::(\w+):\s+(\d+)", text)}
    executions, seconds = stats.get("number_of_executed_units", 0), used.ru_utime + used.ru_stime
    rate = executions / max(seconds, 0.01)
    slow = rate < ENOUGH and options.seconds >= WARM
    # A target stands in for functions that the fuzzer itself reads and keeps its inputs with.
    unread = f" 0 files found in {seeds}\n" in text
    unkept = stats.get("new_units_added", 0) > 0 and not any(found.iterdir())
    verdict = ("FAILED" if process.returncode != 0 else "SEEDS NOT READ" if unread else "INPUTS NOT KEPT" if unkept
               else "TOO SLOW" if slow else "")
    print(f"{name}: {executions} executions, {rate:.0f} a second of {seconds:.0f} s processor time, "
          f"{stats.get('new_units_added', 0)} new inputs, peak {stats.get('peak_rss_mb', 0)} MB, "
          f"{verdict or 'no finding'}", flush=True)
    if process.returncode != 0:
        print(text[-4000:], flush=True)
    return verdict == "", rate
