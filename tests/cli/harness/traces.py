"""Writes down what the programs under test did, test by test: REMVOL_TRACES=FOLDER (scripts/traces says what for).

A test's file holds each run with its words, its calls in order (command texts and the fake commands that they ran,
tree writes and deletions, sleeps, locks), its exit status and its output; then what the tree holds when the box ends.
What is another at each run is replaced: line numbers of the log, process numbers, folders, devices, times.
"""

import hashlib
import os
import pathlib
import re
import shlex
import subprocess

FOLDER = os.environ.get("REMVOL_TRACES", "")
REPOSITORY = str(pathlib.Path(__file__).resolve().parents[3])
BUILD = pathlib.Path(REPOSITORY, os.environ.get("REMVOL_BUILD", "build/release")).resolve()

# Replaced in every line, in this order.
CHANGING = [(re.compile(pattern), text) for pattern, text in (
    (r"\(([\w.]+\.(?:cpp|h):[^:()\s]+):\d+\)", r"(\1)"),
    (r"(: src\.cpp:)\d+(: \w+: Assertion)", r"\1#\2"),
    (r"/tmp/pytest-of-\w+/pytest-\d+(/popen-gw\d+)?/\w+", "TMP"),
    (r"/tmp/(ktree\.|tmp)\w+", r"/tmp/\1#"),
    (r"(remvol_session_(?:wait|get)_lun)_\d+", r"\1_#"),
    (r"/proc/\d+/", "/proc/#/"),
    (r"--target=\d+", "--target=#"),
    (r"\bloop\d+", "loop#"),
    (r"(sysaux_call loop#) '7 \d+'", r"\1 '7 #'"),
    (r"(^ *|[ /])7:\d+\b", r"\g<1>7:#"),
    (r"^  usleep \d+", "  usleep #"),
    (r"(retry cmd : cycle = \d+, time =) \d+", r"\1 #"),
    (r"\d\d:\d\d:\d\d", "#:#:#"),
    (r"\bpid = \d+", "pid = #"),
    (r"took = \d+ microseconds", "took = # microseconds"),
    (r"copied, [^,]+ s, .*/s$", "copied"),
    (r"^    \d+ \d+ \d+:\d+ ", "    # # #:# "),
    (r"0x[0-9a-f]+", "0x#"),
    (r"^(    ) *\d+( +\d+)*(\(src\.cpp:)", r"\1\3"),
)]

# Lines that are left out: whether and where they come is a matter of moments.
FLEETING = re.compile("|".join((
    r"^    (?:! )?(resize2fs[ :]|The filesystem is already|Filesystem at .* is mounted on|old_desc_blocks|/dev/\S+: *$)",  # in the background
    r"^  set \S+/format_progress ",  # what a format has got to when somebody looks
    r"^    (?:! )?(?:(logging in|logged in) to |\S.*: (looking at its disk|its disk is ready|mounted)$)",  # steps that are shown when they are seen
    r"^  run remvol-notify ",  # started beside the listener
    r"^ *!? *$",
)))


def file_of(test):
    """Where the trace of a test is: its readable name, cut, and what keeps names apart that are alike then."""
    path, _, name = test.partition("::")
    short = re.sub(r"[^\w.,=+-]+", "_", name)[:120]
    return pathlib.Path(FOLDER) / pathlib.PurePath(path).stem / f"{short}.{hashlib.sha1(name.encode()).hexdigest()[:8]}"


def settled(text):
    """The text without what is another at each run."""
    for folder, name in ((str(BUILD), "BUILD"), (REPOSITORY, "REPOSITORY")):
        text = text.replace(folder, name)
    for expression, name in CHANGING:
        text = expression.sub(name, text)
    return text


def add(*lines):
    """Adds lines to the trace of the test that is running."""
    path = file_of(os.environ.get("PYTEST_CURRENT_TEST", "no test (call)").rpartition(" ")[0])
    path.parent.mkdir(parents=True, exist_ok=True)
    with open(path, "a", encoding="utf-8", errors="surrogateescape") as file:
        file.writelines(line + "\n" for line in map(settled, lines) if not FLEETING.search(line))


def block(text, margin="    "):
    """The lines of an output, text or bytes or none."""
    if isinstance(text, bytes):
        text = text.decode("utf-8", "surrogateescape")
    return [margin + line for line in (text or "").split("\n")]


def end(status, output, errors):
    return [f"  status {status}", *block(output), *block(errors, "    ! ")]


def words_of(argv):
    return shlex.join(os.fsdecode(word) for word in argv)


class NoRecorder:
    """In place of a Recorder where nothing is recorded."""

    def started(self, running):
        pass

    def shown(self, running, text):
        pass

    def forgotten(self):
        pass

    close = forgotten


class Recorder:
    """What happens in one box. What runs beside something else comes in another order each time; so the calls stand
    below the run that made them, and those of other processes at the end, sorted."""

    def __init__(self, box):
        self.box, self.log_read = box, 0
        self.runs, self.screens = [], {}
        self.processes = {}  # process number: its calls, each with the fake commands that its shell ran
        self.shells = {}  # command text: the last call with it
        self.loose = []

    def started(self, running):
        self.runs.append(running)

    def shown(self, running, text):
        """What a terminal has shown."""
        self.screens[running] = text

    def look(self):
        """Takes what has come to the log."""
        with open(self.box.root / "fake" / "log", "rb") as log:
            log.seek(self.log_read)
            lines = log.read()
            self.log_read = log.tell()
        for line in lines.decode("latin-1").split("\n"):
            kind, *more = line.split("\t")
            if kind in ("run", "unscripted"):
                self._fake_command(kind, *more[1:])
            elif kind:
                self._call(kind, *more)

    def _call(self, kind, process, *fields):
        made = [f"  {kind} " + " | ".join(fields)]
        self.processes.setdefault(process, []).append(made)
        if kind in ("system", "popen"):
            self.shells[fields[0]] = made

    def _fake_command(self, kind, name, shell, locale, *arguments):
        """One in the background comes when it comes: the command text of its caller says all of it."""
        if shell in self.shells and not shell.endswith("&"):
            self.shells[shell].append(f"    {kind} {name} | {locale} | " + " | ".join(arguments))
        elif not any(text.endswith("&") and name in text for text in self.shells):
            self.loose.append(f"  {kind} {name} | {locale} | " + " | ".join(arguments))

    def forgotten(self):
        """The log begins anew."""
        self.look()
        self.log_read = 0

    def _calls_of(self, process):
        return [line for made in self.processes.pop(str(process), []) for line in made]

    def close(self):
        self.look()
        for running in self.runs:
            add(f"run: {words_of(running.argv)}", *self._calls_of(running.pid), *block(self.screens.get(running)))
            if running.result is not None:
                add(*end(running.result.status, running.result.stdout, running.result.stderr))
        for calls in sorted(self._calls_of(process) for process in list(self.processes)):
            add("another process:", *calls)
        if self.loose:
            add("other commands:", *sorted(self.loose))
        if self.box.tree.daemon is not None:
            add("tree:", *block(self.box.tree.text(), "  "))


def recorder(box):
    return Recorder(box) if FOLDER else NoRecorder()


def record_outside():
    """From now on runs of the build's programs outside of a box are recorded, too."""
    real = subprocess.run

    def run(argv, *more, **options):
        done = real(argv, *more, **options)
        if not isinstance(argv, str) and any(str(BUILD) in os.fsdecode(word) for word in argv):
            add(f"run outside: {words_of(argv)}", *end(done.returncode, done.stdout, done.stderr))
        return done

    if FOLDER:
        subprocess.run = run
