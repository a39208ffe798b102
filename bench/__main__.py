"""scripts/bench: see there."""

import argparse
import dataclasses
import datetime
import json
import os
import pathlib
import subprocess
import sys
import tempfile

sys.path.insert(0, str(pathlib.Path(__file__).parent))

import page  # noqa: E402
import road  # noqa: E402
import waits  # noqa: E402
from figures import Figure, Growth, Table, number  # noqa: E402


def measurements():
    import runs
    import scale
    import tree
    return [tree.round_trips, tree.many_clients, tree.nodes, tree.settings, tree.values, runs.share_name, runs.volumes,
            runs.status, runs.size, runs.instructions, runs.idle, scale.scale]


def show(found):
    if isinstance(found, Growth):
        print(f"  {found.title}: {', '.join(f'{number(size)}: {number(cost)}' for size, cost, *_ in found.points)} {found.cost}")
        return
    if isinstance(found, Table):
        print(f"  {found.title}:")
        for row in [found.head, *found.rows]:
            print(f"    {' | '.join(row)}")
        return
    limit = f"  ({found.limit}{'' if found.holds else ': MISSED'})" if found.limit else ""
    print(f"  {found.what}: {found.text}{limit}")
    if found.detail:
        print(f"    {found.detail}")


def measure_inside(options):
    """In namespaces of its own: measures what needs no appliance, and hands it to the run outside."""
    import world
    world.enter()
    found = []
    for measurement in measurements():
        if options.only not in measurement.__name__:
            continue
        print(measurement.__name__, flush=True)
        for one in measurement(options.short):
            show(one)
            found.append({"kind": type(one).__name__, **dataclasses.asdict(one)})
    pathlib.Path(options.inside).write_text(json.dumps(found))


def measure(options):
    if not options.short and options.only in "scale":
        import scale
        scale.build()
    with tempfile.NamedTemporaryFile(dir=os.environ["REMVOL_BUILD"], suffix=".json") as results:
        words = ["--inside", results.name, "--only", options.only] + ["--short"] * options.short
        # Before all other processes of the machine.
        subprocess.run(["chrt", "--fifo", "50", "unshare", "--mount", "--pid", "--ipc", "--fork", "--kill-child", "--mount-proc",
                        sys.executable, "-B", pathlib.Path(__file__).parent, *words], check=True)
        found = json.loads(pathlib.Path(results.name).read_text())
    kinds = {kind.__name__: kind for kind in (Figure, Growth, Table)}
    return [kinds[one.pop("kind")](**one) for one in found]


def main():
    parser = argparse.ArgumentParser(prog="scripts/bench")
    parser.add_argument("--short", action="store_true", help="a few rounds of each, judged by nothing and written nowhere")
    parser.add_argument("--only", default="", metavar="WORD", help="measurements whose name has the word; writes nothing")
    parser.add_argument("--inside", help=argparse.SUPPRESS)
    options = parser.parse_args()
    if options.inside:
        return measure_inside(options)
    found = []
    for measurement in (road.mount, road.road, waits.waits):
        if options.short or options.only not in measurement.__name__:
            continue
        print(measurement.__name__, flush=True)
        for one in measurement():
            show(one)
            found.append(one)
    found += measure(options)
    figures = [one for one in found if isinstance(one, Figure)]
    if not options.short and not options.only:
        growths, tables = ([one for one in found if isinstance(one, kind)] for kind in (Growth, Table))
        page.write(figures, growths, tables, f"{datetime.date.today():%F}")
    missed = [one for one in figures if not one.holds]
    if options.short:
        print(f"bench: {len(figures)} passed, 0 failed (a short run measures and judges nothing)")
        return 0
    print(f"bench: {len(figures) - len(missed)} hold, {len(missed)} past their limit")
    return 1 if missed else 0


sys.exit(main())
