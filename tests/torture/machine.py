"""The virtual appliance (lab/run) as a machine that does what it is told, and whose power can be cut.

    with Appliance(folder, options) as appliance:
        appliance.boot()
        status, text = appliance.ask("remvol --status")     # text: both outputs
        appliance.cut_at = time.monotonic() + 0.7           # from now on ask() may raise PowerCut
"""

import base64
import importlib.machinery
import importlib.util
import os
import pathlib
import random
import select
import sys
import time

REPOSITORY = pathlib.Path(__file__).resolve().parents[2]
PATIENCE = 300  # seconds: no command takes so long, whatever else the machine does


def load_lab():
    loader = importlib.machinery.SourceFileLoader("lab", str(REPOSITORY / "lab/run"))
    lab = importlib.util.module_from_spec(importlib.util.spec_from_loader("lab", loader))
    loader.exec_module(lab)
    return lab


lab = load_lab()
if lab.ARCH:
    sys.exit("lab: the machine of a torture has this machine's own architecture, not that of LAB_ARCH")


class PowerCut(Exception):
    """The power is gone; what had been asked was not answered before."""


class Dead(Exception):
    """The appliance said nothing for long, or ended by itself."""


class LoggedMachine(lab.Machine):
    """A machine with a log of all that reaches its disk (QEMU's blklogwrites)."""

    def drive(self):
        disk = (f"driver=blklogwrites,node-name=disk,file.driver=file,file.filename={self.disk},file.cache.no-flush=on,"
                f"log.driver=file,log.filename={self.folder}/log,log.cache.no-flush=on")
        return ["-blockdev", disk, "-device", "virtio-blk-pci,drive=disk,write-cache=on"]


def build():
    return REPOSITORY / os.environ.get("REMVOL_BUILD", "build/release")


def first_seed(wanted):
    return wanted if wanted is not None else random.SystemRandom().randrange(1 << 30)


def prepare(script="power.sh"):
    """The scenario, which ends with answer.sh, and the archive of the project that every machine boots with."""
    os.environ["LAB_BUILD"] = str(build())
    folder = pathlib.Path(__file__).parent
    scenario = lab.Scenario(str(folder / script))
    scenario.text += (folder / "answer.sh").read_text()
    lab.CACHE.mkdir(parents=True, exist_ok=True)
    projects = lab.project_archives([scenario])
    lab.prepare_bases([scenario])
    if not scenario.base.result():
        raise SystemExit("torture: the virtual appliance could not be made")
    return scenario, projects


class Appliance:
    def __init__(self, folder, prepared, logged=False):
        self.folder = pathlib.Path(folder)
        self.machine = (LoggedMachine if logged else lab.Machine)(*prepared, self.folder)
        if logged:
            (self.folder / "log").touch()
        self.qemu = self.port = None
        self.pending = b""
        self.cut_at = None  # time.monotonic() of the cut
        self.boots = 0

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.cut()

    def boot(self):
        """Returns when the targets are up and a command can be asked for."""
        self.boots += 1
        self.pending = b""
        self.qemu, self.port = self.machine.boot(self.boots)
        self.wait("up")

    def cut(self):
        """The power goes at once. What the appliance had said before stays to be read."""
        if self.qemu is None:
            return
        self.qemu.kill()
        self.qemu.wait()
        self.qemu = None
        while data := self.port.recv(65536):
            self.pending += data
        self.port.close()

    def ask(self, line):
        """Runs a command line in the appliance. Returns its status and what it printed."""
        if self.qemu is None:
            raise PowerCut
        self.port.sendall(line.encode() + b"\n")
        return self.wait("done")

    def wait(self, wanted):
        deadline = time.monotonic() + PATIENCE
        while True:
            event = self.next_event()
            if event and event[0] == wanted:
                return (int(event[1]), base64.b64decode("".join(event[2:])).decode(errors="replace")) if event[1:] else None
            if event:
                continue
            if self.qemu is None:
                raise PowerCut
            self.fill(deadline)

    def next_event(self):
        """The words of the next line that begins with the mark; what comes before is thrown away."""
        _, mark, rest = self.pending.partition(lab.MARK)
        line, end, more = rest.partition(b"\n")
        if not mark or not end:
            return None
        self.pending = more
        return line.decode().split()

    def fill(self, deadline):
        until = min(deadline, self.cut_at or deadline)
        if select.select([self.port], [], [], max(0, until - time.monotonic()))[0]:
            data = self.port.recv(65536)
            if not data:
                raise Dead(f"the appliance ended; its console: {self.machine.console}")
            self.pending += data
        elif self.cut_at and time.monotonic() >= self.cut_at:
            self.cut_at = None
            self.cut()
        elif time.monotonic() >= deadline:
            raise Dead(f"no answer for {PATIENCE} s; the console: {self.machine.console}")
