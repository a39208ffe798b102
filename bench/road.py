"""A volume's road in the virtual appliance, and a mount on a loop device, each beside the same commands alone."""

import os
import pathlib
import re
import subprocess

from figures import Figure

TOP = pathlib.Path(__file__).resolve().parent.parent


def in_appliance(scenario):
    """What the scenario says in the appliance, with the build that is measured."""
    return subprocess.run([TOP / "lab/run", TOP / scenario], stdout=subprocess.PIPE, text=True,
                          env={**os.environ, "LAB_BUILD": os.environ["REMVOL_BUILD"]}).stdout


def mount():
    said = subprocess.run([TOP / "bench/mount.sh", os.environ["REMVOL_BUILD"]], stdout=subprocess.PIPE, text=True).stdout
    value = float(re.search(r"\| ratio, at most [\d.]+ \| ([\d.]+) \|", said).group(1))
    yield Figure("Whole runs", "the mount of a formatted LUN / its commands alone", value, 1.1)


def road():
    said = in_appliance("bench/road/scenario.sh")
    times = re.search(r"through remvol: (\d+) ms +through a plain script: (\d+) ms +\(medians of (\d+)\)", said)
    if not times:
        raise RuntimeError(f"the appliance said:\n{said}")
    ours, plain, rounds = (int(value) for value in times.groups())
    yield Figure("In the appliance", "add, connect with a format, disconnect / the same commands with the same waits",
                 ours / plain, 1.03, detail=f"{ours} and {plain} ms, medians of {rounds}")
