"""The box itself: see the package's own text for how it is used."""

import array
import itertools
import os
import pathlib
import shlex
import shutil
import signal
import socket
import subprocess
import time

from .disks import attach, detach, lead_to_controller, lead_to_session
from .result import Arguments, Call, Result, escape, matcher, unescape
from .traces import recorder
from .tree import Tree
from .under import SLOWER, keep, under, without

COMMANDS = (
    "iscsiadm iscsid insmod rmmod mke2fs e2fsck resize2fs mount umount fuser dd ping ps killall "
    "winshare_reload macshare_reload flashrun"
).split()
SYSTEM_PATH = "/usr/local/sbin:/usr/local/bin:/usr/sbin:/usr/bin:/sbin:/bin"
SHELL_KINDS = ("system", "popen", "sleep", "usleep")
TIMEOUT = 20 * SLOWER


def build_folder():
    repository = pathlib.Path(__file__).resolve().parents[3]
    return (repository / os.environ.get("REMVOL_BUILD", "build/release")).resolve()


def machine_folder():
    """Where the boxes and fake commands are, which run on this machine: apart when the programs are another's."""
    return pathlib.Path(os.environ.get("REMVOL_MACHINE", build_folder())).resolve()


class Running:
    """A program in the box that has been started."""

    def __init__(self, box, number, argv, out, err):
        self.box, self.number, self.argv, self.out, self.err = box, number, argv, out, err
        self.pid = None
        self.result = None

    @property
    def stdout(self):
        return _read_all(self.out) if self.result is None else self.result.stdout

    @property
    def stderr(self):
        return _read_all(self.err) if self.result is None else self.result.stderr

    def kill(self, number=signal.SIGKILL):
        self.box.send(["kill", self.number, int(number)])

    def wait(self, timeout=TIMEOUT):
        end = time.monotonic() + timeout
        while self.result is None:
            if not self.box.pump(end - time.monotonic()):
                self.kill()
                raise TimeoutError(f"{self.argv} ran over {timeout} s; so far:\n{self.stdout}{self.stderr}")
        return self.result

    def ended(self, status):
        code = os.waitstatus_to_exitcode(status)
        self.result = Result(code, self.stdout, self.stderr)
        os.close(self.out)
        os.close(self.err)


class Box:
    def __init__(self):
        self.build = build_folder()
        self.tools = self.build / "tests" / "harness"
        self.machine_tools = machine_folder() / "tests" / "harness"
        self.numbers = itertools.count(1)
        self.running = {}
        self.rules = {"first": [], "in order": [], "last": []}
        self.rule_numbers = itertools.count()
        self.disks = []
        self.environment = {}
        self.allowed_unscripted = False
        self.check_leaks = True
        self._open()
        self.root = pathlib.Path(f"/proc/{self.pid}/root")
        self._prepare_fakes()
        self.recorder = recorder(self)
        self.tree = Tree(self)

    def _open(self):
        self.control, theirs = socket.socketpair(socket.AF_UNIX, socket.SOCK_SEQPACKET)
        for end in (self.control, theirs):
            end.setsockopt(socket.SOL_SOCKET, 32, 4 << 20)  # SO_SNDBUFFORCE: a request may be long
        repository = pathlib.Path(__file__).resolve().parents[3]
        keep = [repository] if self.build.is_relative_to(repository) else [repository, self.build]
        self.process = subprocess.Popen(
            [self.machine_tools / "box", str(theirs.fileno()), *keep], pass_fds=[theirs.fileno()]
        )
        theirs.close()
        answer = self.control.recv(4096).decode()
        if not answer.startswith("ready "):
            raise RuntimeError(f"no box: {answer or 'its first process died'} (a box needs root)")
        self.pid = int(answer.split()[1])

    def _prepare_fakes(self):
        fake = self.root / "fake"
        (fake / "bin").mkdir()
        shutil.copy(self.machine_tools / "fakecmd", fake / "command")
        for name in COMMANDS:
            (fake / "bin" / name).symlink_to("/fake/command")
        with open(fake / "counters", "wb") as counters:
            counters.truncate(4 * 4096)
        (fake / "log").touch()
        for name in ("log", "counters"):
            (fake / name).chmod(0o666)
        for name in ("winshare_reload", "macshare_reload", "flashrun"):
            self.default(name)

    # --- files ---

    def path(self, name):
        """The path outside of the box's file `name`; links on the way are followed inside the box."""
        parts, done, hops = [p for p in str(name).split("/") if p], [], 0
        while parts:
            part = parts.pop(0)
            if part == "..":
                done = done[:-1]
                continue
            here = self.root.joinpath(*done, part)
            if parts and here.is_symlink() and hops < 40:
                hops += 1
                target = os.readlink(here)
                done = [] if target.startswith("/") else done
                parts = [p for p in target.split("/") if p] + parts
            else:
                done.append(part)
        return self.root.joinpath(*done)

    def write(self, name, text, mode=None):
        path = self.path(name)
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_bytes(text if isinstance(text, bytes) else text.encode())
        if mode is not None:
            path.chmod(mode)
        return path

    def disk(self, name, size, sysfs=False):
        """Makes /dev/NAME of the box a loop device of `size` bytes; gives its backing file."""
        backing, loop = attach(self, name, size, sysfs)
        self.disks.append(loop)
        return backing

    def session_disk(self, name, target, lun=0, session=1):
        """From now on sysfs says that NAME is this LUN of the target."""
        lead_to_session(self, name, target, lun, session)

    def local_disk(self, name):
        """From now on sysfs says that NAME is a disk of the machine."""
        lead_to_controller(self, name)

    # --- programs ---

    def env(self, extra=None):
        sanitizers = "abort_on_error=0:log_path=/fake/sanitizer"
        env = {
            "PATH": f"/fake/bin:{self.build}/bin:{SYSTEM_PATH}",
            "HOME": "/root",
            "LD_PRELOAD": self._preload(),
            "ASAN_OPTIONS": f"verify_asan_link_order=0:detect_leaks={int(self.check_leaks)}:{sanitizers}",
            "UBSAN_OPTIONS": f"print_stacktrace=1:{sanitizers}",
            **self.environment,
            **(extra or {}),
        }
        return {name: value for name, value in env.items() if value is not None}

    def _preload(self):
        """For programs of two architectures the loader of each puts its own folder in place of $LIB."""
        if self.tools == self.machine_tools:
            return str(self.tools / "libpreload.so")
        return str(self.machine_tools / "$LIB" / "libpreload.so")

    def send(self, words, streams=()):
        data = b"\0".join(os.fsencode(str(word)) for word in words) + b"\0"
        rights = [(socket.SOL_SOCKET, socket.SCM_RIGHTS, array.array("i", streams))] if streams else []
        self.control.sendmsg([data], rights)

    def pump(self, timeout):
        """Takes one message of the box; False when none came in time."""
        self.control.settimeout(max(timeout, 0.001))
        try:
            words = self.control.recv(4096).decode().split()
        except TimeoutError:
            return False
        if not words:
            raise RuntimeError("the box died")
        running = self.running[int(words[1])]
        if words[0] == "started":
            running.pid = int(words[2])
        else:
            del self.running[int(words[1])]
            running.ended(int(words[2]))
        return True

    def start(self, argv, *, input=None, env=None, cwd="/", own=False):
        """`own`: a run of the box itself, which belongs to no trace."""
        number = next(self.numbers)
        stdin = os.memfd_create("in") if input is not None else os.open("/dev/null", os.O_RDONLY)
        if input is not None:
            os.write(stdin, input if isinstance(input, bytes) else input.encode())
            os.lseek(stdin, 0, os.SEEK_SET)
        out, err = (os.memfd_create(name, os.MFD_CLOEXEC) for name in ("out", "err"))
        running = self.running[number] = Running(self, number, argv, out, err)
        variables = [f"{name}={value}" for name, value in self.env(env).items()]
        if not own:
            self.recorder.started(running)
        words = under(argv, self.build, "/fake/found")
        self.send(["run", number, cwd, len(words), *words, *variables], [stdin, out, err])
        os.close(stdin)
        while running.pid is None and running.result is None:
            if not self.pump(TIMEOUT):
                raise TimeoutError(f"{argv} did not start")
        return running

    def run(self, argv, *, timeout=TIMEOUT, **options):
        return self.start(argv, **options).wait(timeout)

    def debug(self, level):
        self.tree.set("/iscsi/initiator/dbg", level)

    def remvol(self, *args, **options):
        return self.run(["remvol", *args], **options)

    def processes(self):
        """The commands of the box's processes, by process number inside, without its first process."""
        found = {}
        for entry in (self.root / "proc").iterdir():
            if entry.name.isdigit() and entry.name != "1":
                try:
                    words = (entry / "cmdline").read_bytes().rstrip(b"\0").split(b"\0")
                    ended = (entry / "stat").read_text().rpartition(") ")[2][0] in "ZX"
                except OSError:
                    continue
                if not ended:  # one that is about to execute a program has no words for a moment
                    found[int(entry.name)] = without([word.decode("utf-8", "replace") for word in words])
        return found

    def wait_until(self, condition, timeout=TIMEOUT, what="the condition"):
        end = time.monotonic() + timeout
        while not condition():
            if time.monotonic() > end:
                raise TimeoutError(f"{what} did not come true in {timeout} s; running: {self.processes()}")
            time.sleep(0.002)

    def wait_quiet(self, timeout=TIMEOUT):
        def only_trees():
            return all(os.path.basename(argv[0]) == "ktree" for argv in self.processes().values())

        # A process may start another and end while they are being listed, and neither is seen; but not again and again.
        self.wait_until(lambda: all(only_trees() for _ in range(3)), timeout, "quiet")

    # --- the script ---

    def _rule(self, place, name, how, pattern, value="\n", *, skip=0, times=None, result=0, errno=0, out="",
              err="", effect="", delay=0, kill=0, through=False, real=False):
        number = next(self.rule_numbers)
        times = -1 if times is None else times
        fields = [number, name, how, pattern, value, skip, times, result, errno, out, err, effect,
                  int(delay * 1000), int(kill), int(through), int(real)]
        self.rules[place].insert(0 if place == "first" else number, "\t".join(escape(f) for f in fields))
        script = self.root / "fake" / "script"
        draft = script.with_suffix(".new")
        draft.write_text("\n".join(line for lines in self.rules.values() for line in lines) + "\n")
        draft.rename(script)

    def fake(self, name, args=None, *, exact=False, stdout="", stderr="", status=None, first=False,
             place="in order", **options):
        link = self.root / "fake" / "bin" / name
        if not link.is_symlink():
            link.symlink_to("/fake/command")
        if status is None:
            status = -1 if options.get("effect") else 0
        how, pattern = matcher(args, "exact" if exact else "words")
        self._rule("first" if first else place, name, how, pattern, result=status, out=stdout, err=stderr,
                   **options)

    def default(self, name, args=None, **options):
        self.fake(name, args, place="last", **options)

    def hook(self, function, subject=None, *, value=None, ret=0, out="", first=False, **options):
        how, pattern = matcher(subject, "exact")
        self._rule("first" if first else "in order", function, how, pattern, "\n" if value is None else value,
                   result=ret, out=out, **options)

    def unscripted_ok(self):
        self.allowed_unscripted = True

    def leaks_unchecked(self):
        self.check_leaks = False

    def sleep_takes(self, milliseconds):
        self.environment["FAKE_SLEEP_MS"] = str(milliseconds)

    # --- the log ---

    @property
    def calls(self):
        text = (self.root / "fake" / "log").read_text("latin-1")
        lines = (line.split("\t") for line in text.split("\n") if line)
        return [Call(kind, int(pid), [unescape(f) for f in fields]) for kind, pid, *fields in lines]

    def trace(self, *kinds):
        kinds = kinds or SHELL_KINDS
        return [str(call) for call in self.calls if call.kind in kinds]

    def shell(self):
        return [call.fields[0] for call in self.calls if call.kind in ("system", "popen")]

    def runs(self, name):
        return [Arguments(call) for call in self.calls if call.kind == "run" and call.fields[0] == name]

    def forget(self):
        self.recorder.forgotten()
        os.truncate(self.root / "fake" / "log", 0)

    # --- the end ---

    def complaints(self):
        """What makes a test fail at its end."""
        found = [
            f"the script has no answer for: {shlex.join([c.fields[0], *c.fields[3:]])}"
            for c in self.calls
            if c.kind == "unscripted" and not self.allowed_unscripted
        ]
        found += [f"bad expression: {c.fields[0]}" for c in self.calls if c.kind == "bad-regex"]
        return found + [p.read_text() for p in (self.root / "fake").glob("sanitizer.*")]

    def close(self):
        self.recorder.close()
        keep((self.root / "fake").glob("found.*"), os.environ.get("PYTEST_CURRENT_TEST", "").rpartition(" ")[0])
        for loop in self.disks:
            detach(loop)
        self.control.close()
        self.process.wait()
        for running in list(self.running.values()):
            os.close(running.out)
            os.close(running.err)


def _read_all(fd):
    return os.pread(fd, os.fstat(fd).st_size, 0).decode("utf-8", "surrogateescape")
