"""Every write that reached the disk is logged, and the disk is put together again as a power cut may have left it.

A killed emulator keeps what had reached its host. Here it is at its worst: at any moment the disk holds what was written
before the last flush, and any part of what was written since. For every flush of one run of the loop such a disk is made,
the part drawn by the seed; the file system on it is mounted, and those on the LUNs in it, with their journals played back.
"""

import contextlib
import ctypes
import hashlib
import json
import os
import pathlib
import random
import subprocess
import tempfile
import time

import write_log
from machine import Appliance, build, first_seed, lab, prepare
from power import settings_of
from power_model import VOLUMES, WITNESS, Model, Step

SETTINGS = ("etc/NAS_CFG/vv.xml", "usr/local/config/vv.xml")  # on the disk
CLONE_NEWNS = 0x00020000


def own_mounts():
    """What this process mounts from now on is gone when it ends, however it ends."""
    if ctypes.CDLL(None, use_errno=True).unshare(CLONE_NEWNS) != 0:
        raise OSError(ctypes.get_errno(), "unshare")
    subprocess.run(["mount", "--make-rprivate", "/"], check=True)


class Recording:
    """One run of the loop on a logged disk. An event is (end of the log at that moment, kind, details)."""

    def __init__(self, seed, prepared, folder, steps):
        self.folder, self.events, self.found = pathlib.Path(folder), [], []
        dice, model = random.Random(seed), Model()
        with Appliance(folder, prepared, logged=True) as self.appliance:
            subprocess.run(["cp", "--sparse=always", self.folder / "disk", self.folder / "start"], check=True)
            self.appliance.boot()
            self.do(model, Step("init"))
            for number in range(steps):
                self.do(model, model.choose(dice, number))

    def position(self):
        return (self.folder / "log").stat().st_size

    def do(self, model, step):
        self.events.append((self.position(), "begin", step))
        status, text = self.appliance.ask(step.line())
        at = self.position()
        if status != 0:
            self.found.append(f"refused: '{step}' gave {status}: {text[-300:]}")
            return
        self.events.append((at, "answered", step))
        model.answered(step)
        if step.verb != "write":
            settings = settings_of(self.appliance.ask("settings_files")[1])
            self.events.append((at, "saw", settings))
            self.found += model.saw(settings, step)


class Replay:
    """Goes through the log of a recording and looks at the disk at every flush."""

    def __init__(self, recording, seed, images, folder):
        self.recording, self.seed, self.images = recording, seed, images
        self.folder = pathlib.Path(folder)
        self.bin = build() / "bin"
        self.model, self.under_way = Model(), []
        self.events = list(recording.events)
        self.flushes = self.looked = 0

    def play(self):
        """Returns what was wrong."""
        wrong = []
        base = self.folder / "start"
        with open(self.recording.folder / "log", "rb") as log_file, open(base, "r+b") as disk_file, self.tree_daemon():
            log, disk = log_file.fileno(), disk_file.fileno()
            entries = write_log.entries(log)
            marks = [n for n, entry in enumerate(entries) if entry.flags & write_log.FLUSH]
            marks = [n for n in marks if entries[n].start >= self.events[0][0]] + [len(entries)]
            self.flushes = len(marks) - 1
            chosen = set(marks[:-1])
            if self.images is not None and self.images < len(chosen):
                chosen = set(random.Random(self.seed).sample(sorted(chosen), self.images))
            following = dict(zip(marks, marks[1:]))
            for n, entry in enumerate(entries):
                write_log.apply(entry, log, disk)
                if n in following:
                    since = entries[n + 1: following[n]]
                    self.follow(since[-1].end if since else entry.end)
                    if n in chosen:
                        wrong += [f"flush {n}: {text}" for text in self.look(n, base, log, since)]
        return wrong

    def follow(self, end):
        """What had begun and what was answered when the log ended there."""
        while self.events and self.events[0][0] <= end:
            _, kind, what = self.events.pop(0)
            if kind == "begin":
                self.under_way = [what]
            elif kind == "answered":
                self.under_way = []
                self.model.answered(what)
            else:
                self.model.saw(what)

    def look(self, number, base, log, since):
        """The disk with what was flushed and some of what was written since."""
        self.looked += 1
        dice = random.Random(f"{self.seed} {number}")
        share = dice.choice([0, 0.5, 0.9, 1])
        image, place = self.folder / "image", self.folder / "disk"
        subprocess.run(["cp", "--sparse=always", base, image], check=True)
        with open(image, "r+b") as file:
            for entry in since:
                if dice.random() < share:
                    write_log.apply(entry, log, file.fileno())
        try:
            with mounted(image, place):
                return self.findings(place)
        except subprocess.CalledProcessError as error:
            return [f"lost: the disk of the settings cannot be mounted: {error.stderr}"]

    def findings(self, place):
        settings = tuple(path.read_bytes() if (path := place / name).exists() else None for name in SETTINGS)
        wrong = self.model.settings_findings(settings, self.under_way)
        for name, content in zip(SETTINGS, settings):
            if content is not None and self.ktreec("-l", place / name) != 0:
                wrong.append(f"settings: {name} cannot be loaded")
        if hashlib.md5((place / "luns/t2-l2").read_bytes()).hexdigest() != WITNESS:
            wrong.append("foreign-disk: the LUN that no command names has changed")
        for volume, files in self.model.kept_files(self.under_way).items():
            if not files:
                continue
            try:
                wrong += self.model.file_findings({volume: self.files_of(place, volume)}, self.under_way)
            except (subprocess.CalledProcessError, KeyError, IndexError) as error:
                wrong.append(f"lost: '{volume}' cannot be mounted: {getattr(error, 'stderr', error)}")
        return wrong

    def files_of(self, place, volume):
        lun = place / "luns/t{}-l{}".format(*VOLUMES[volume])
        table = subprocess.run(["sfdisk", "--json", lun], check=True, capture_output=True, text=True).stdout
        partition = json.loads(table)["partitiontable"]["partitions"][0]
        inside = self.folder / "volume"
        with mounted(lun, inside, f",offset={partition['start'] * 512},sizelimit={partition['size'] * 512}"):
            return {path.name: hashlib.md5(path.read_bytes()).hexdigest() for path in inside.iterdir() if path.is_file()}

    # ---- the tree, as the appliance loads it ----

    @contextlib.contextmanager
    def tree_daemon(self):
        socket = self.folder / "tree"
        daemon = subprocess.Popen([self.bin / "ktree", "-n", "replay", "-s", socket])
        try:
            while not socket.exists() and daemon.poll() is None:
                os.sched_yield()
            yield
        finally:
            daemon.terminate()
            daemon.wait()

    def ktreec(self, *words):
        return subprocess.run([self.bin / "ktreec", "-S", self.folder / "tree", *words], check=False,
                              stderr=subprocess.DEVNULL).returncode


@contextlib.contextmanager
def mounted(image, place, more=""):
    """The file system of an image, with its journal played back."""
    place.mkdir(exist_ok=True)
    subprocess.run(["mount", "-t", "ext4", "-o", f"loop{more}", image, place], check=True, capture_output=True, text=True)
    try:
        yield
    finally:
        subprocess.run(["umount", place], check=True)


def play(seed, prepared, options):
    """Records and replays one run. Returns what was wrong, the number of flushes and that of the disks looked at."""
    with tempfile.TemporaryDirectory(dir=lab.CACHE, prefix="replay.") as folder, \
            tempfile.TemporaryDirectory(dir="/dev/shm", prefix="replay.") as fast:
        recording = Recording(seed, prepared, folder, options.steps)
        subprocess.run(["mv", f"{folder}/start", fast], check=True)
        replay = Replay(recording, seed, options.images, fast)
        return recording.found + replay.play(), replay.flushes, replay.looked


def run(options):
    own_mounts()
    seed = first_seed(options.seed)
    print(f"replay: seed {seed}", flush=True)
    prepared, begin = prepare(), time.monotonic()
    disks = bad = flushes = number = 0
    while number < options.rounds and (options.seconds is None or time.monotonic() - begin < options.seconds):
        found, passed, looked = play(seed + number, prepared, options)
        disks, flushes, bad = disks + looked, flushes + passed, bad + len(found)
        if found:
            print(f"run with seed {seed + number}:", *found, sep="\n  ", flush=True)
        number += 1
    seconds = time.monotonic() - begin
    print(f"replay: {max(0, disks - bad)} passed, {bad} failed (disks; {flushes} flushes in {number} runs, {seconds:.0f} s)")
    return bad == 0


def add_form(forms):
    form = forms.add_parser("replay", help="the disk as it was at every flush")
    form.add_argument("--rounds", type=int, default=20, help="runs of the loop")
    form.add_argument("--seconds", type=float, help="begin no run after so long")
    form.add_argument("--seed", type=int, help="of the first run; the next has the next number")
    form.add_argument("--steps", type=int, default=12, help="of the loop in each run")
    form.add_argument("--images", type=int, help="look at no more disks of a run than so many, drawn by the seed")
    form.set_defaults(run=run)
