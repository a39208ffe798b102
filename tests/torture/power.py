"""The power is cut at a random moment, again and again, and the appliance boots from the same disk.

A machine lives through some boots. Each boot looks at the disk, brings the appliance up, looks at everything, and goes on
with the loop of steps until the next cut. Its seed draws the steps, and for every cut the step and how long after its
beginning the power goes. After the last cut every volume that was ever made is added and connected again, for its files.
"""

import base64
import contextlib
import pathlib
import random
import shutil
import tempfile
import time

from machine import Appliance, Dead, PowerCut, first_seed, lab, prepare
from power_model import SECONDS, VOLUMES, Model, Report, Step

BOOT_SECONDS = 6  # of an unhurried machine
CUTS_A_LIFE = 5


def settings_of(text):
    """The settings file and its flash copy, from the answer of "settings_files"."""
    lines = text.split("\n")
    return tuple(base64.b64decode(line) if line else None for line in lines[:2])


class Life:
    """One machine from its first boot to its last."""

    def __init__(self, seed, prepared, cuts, steps, stories=None):
        self.seed, self.prepared, self.cuts, self.steps, self.stories = seed, prepared, cuts, steps, stories
        self.dice = random.Random(seed)
        self.model = Model()
        self.under_way = []
        self.number = 0
        self.found, self.story = [], []
        self.pulled = self.unformatted = 0

    def note(self, text):
        self.story.append(f"{time.monotonic() - self.began:7.2f} {text}")

    def wrong(self, texts):
        for text in texts:
            self.note(f"WRONG {text}")
        self.found += texts

    def play(self):
        """Returns what was wrong."""
        self.began = time.monotonic()
        with tempfile.TemporaryDirectory(dir=lab.CACHE, prefix="power.") as folder:
            with Appliance(folder, self.prepared) as self.appliance:
                try:
                    for cut in range(self.cuts):
                        self.keep_disk(folder)
                        self.live(cut)
                        if self.found:
                            break
                    else:
                        self.keep_disk(folder)
                        self.end()
                except Dead as dead:
                    self.wrong([f"dead: {dead}"])
            if self.found and self.stories:
                self.tell(pathlib.Path(folder))
        return self.found

    def keep_disk(self, folder):
        if self.stories:
            lab.subprocess.run(["cp", "--sparse=always", f"{folder}/disk", f"{folder}/disk.before"], check=True)

    def tell(self, folder):
        """Keeps the story, the console and the disk as it was before the last boot."""
        place = pathlib.Path(self.stories) / f"power-{self.seed}"
        place.mkdir(parents=True, exist_ok=True)
        (place / "story.txt").write_text("\n".join(self.story) + "\n")
        shutil.copy(folder / "console.log", place)
        lab.subprocess.run(["cp", "--sparse=always", folder / "disk.before", place / "disk"], check=True)

    # ---- one boot ----

    def boot(self):
        began = time.monotonic()
        self.appliance.boot()
        self.pace = max(1, (time.monotonic() - began) / BOOT_SECONDS)
        self.note(f"booted, {self.pace:.1f} times slower than an unhurried machine")

    def live(self, cut):
        """From one power-on to the next cut."""
        at, fraction = self.dice.randint(0, self.steps), self.dice.random()
        with contextlib.suppress(PowerCut):
            self.boot()
            self.look()
            self.bring_up(fraction if at == 0 else None)
            for step in range(1, self.steps + 1):
                self.number += 1
                self.do(self.model.choose(self.dice, self.number), fraction if at == step else None)
            self.appliance.cut()  # the step was answered before its moment came
        self.pulled += 1
        self.note(f"cut {cut + 1}, under way: {'; '.join(map(str, self.under_way)) or 'nothing'}")

    def look(self):
        """The disk as the cut left it, before the appliance touches it."""
        self.wrong(self.model.settings_findings(settings_of(self.appliance.ask("settings_files")[1]), self.under_way))

    def bring_up(self, fraction=None):
        before = self.under_way
        self.under_way = [*before, Step("init")]
        self.command(Step("init"), fraction)
        self.command(Step("status"))
        report = Report(self.appliance.ask("report")[1])
        findings = self.model.running_findings(report, before)
        self.wrong(findings)
        if findings:
            return
        self.under_way = []
        self.model.adopt(report)
        self.settle()
        for share in self.model.present - report.mounted:
            if self.model.wish[VOLUMES[share][0]]:
                self.unformatted += 1
                self.note(f"'{share}' has to be formatted again")
                self.do(Step("format", share))

    def settle(self):
        """Takes the settings of now for those that a cut must leave."""
        self.wrong(self.model.saw(settings_of(self.appliance.ask("settings_files")[1])))

    def command(self, step, fraction=None):
        if fraction is not None:
            delay = fraction * SECONDS[step.verb] * self.pace
            self.note(f"the power goes {delay:.2f} s after '{step}' begins")
            self.appliance.cut_at = time.monotonic() + delay
        self.note(f"{step}{f', --status after {step.poll} s' if step.poll else ''}")
        status, text = self.appliance.ask(step.line())
        if status != 0:
            self.wrong([f"refused: '{step}' gave {status}: {text[-300:]}"])
        return status

    def do(self, step, fraction=None):
        self.under_way = [step]
        status = self.command(step, fraction)
        self.under_way = []
        if status == 0:
            self.model.answered(step)
        if step.verb != "write":
            self.wrong(self.model.saw(settings_of(self.appliance.ask("settings_files")[1]), step))
        if self.appliance.cut_at:  # the moment comes after the answer
            time.sleep(max(0, self.appliance.cut_at - time.monotonic()))
            self.appliance.cut_at = None
            self.appliance.cut()
            raise PowerCut

    def end(self):
        """Every volume that was ever made comes back with its files."""
        self.boot()
        self.look()
        self.bring_up()
        if self.found:
            return
        for share, (target, _) in VOLUMES.items():
            if share not in self.model.present:
                self.do(Step("add", share))
        for share, (target, _) in VOLUMES.items():
            if not self.model.wish[target]:
                self.do(Step("connect", share))
        self.command(Step("status"))
        report = Report(self.appliance.ask("report")[1])
        self.wrong(self.model.running_findings(report, []))
        self.wrong([f"lost: '{share}' is not mounted" for share in VOLUMES if share not in report.mounted])


def run(options):
    seed = first_seed(options.seed)
    print(f"power: seed {seed}", flush=True)
    prepared, begin = prepare(), time.monotonic()
    good = bad = again = 0
    while good + bad < options.cuts and (options.seconds is None or time.monotonic() - begin < options.seconds):
        life = Life(seed, prepared, min(CUTS_A_LIFE, options.cuts - good - bad), options.steps, options.stories)
        found = life.play()
        good, bad, again = good + life.pulled - bool(found), bad + bool(found), again + life.unformatted
        if options.verbose:
            print(f"machine with seed {seed}:", *life.story, sep="\n  ", flush=True)
        elif found:
            print(f"machine with seed {seed}:", *found, sep="\n  ", flush=True)
        seed += 1
    print(f"power: {good} passed, {bad} failed (cuts; {again} volumes were cut while formatting and had to be formatted "
          f"again; {time.monotonic() - begin:.0f} s)")
    return bad == 0


def add_form(forms):
    form = forms.add_parser("power", help="the power is cut at random moments")
    form.add_argument("--cuts", type=int, default=100)
    form.add_argument("--seconds", type=float, help="begin with no new machine after so long")
    form.add_argument("--seed", type=int, help="of the first machine; the next has the next number")
    form.add_argument("--steps", type=int, default=6, help="of the loop between two cuts, at most")
    form.add_argument("--stories", help="folder for the story, the console and the disk of a machine with findings")
    form.add_argument("--verbose", action="store_true", help="tell every step")
    form.set_defaults(run=run)
