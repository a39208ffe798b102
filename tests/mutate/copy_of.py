"""A copy of the sources with a build of its own, in which things may be broken."""

import os
import pathlib
import shutil
import signal
import subprocess

from fenced import NAMESPACES

ROOT = pathlib.Path(__file__).resolve().parents[2]
FOLDER = ROOT / "build" / "mutate"
# What the cli tests need beside remvol itself.
PROGRAMS = ("remvol", "ktree", "ktreec", "flashrun", "winshare_reload", "macshare_reload", "remvol-events", "vvstat",
            "box", "fakecmd", "preload", "netlink", "scarce", "sysaux_call", "ktree_call", "volume_driver",
            "sysaux_disk", "sysaux_probe", "sysaux_state")


def run(argv, folder, limit, env=None):
    """Returns (status, output); status None: it was ended after `limit` seconds, with all that it had started."""
    process = subprocess.Popen(argv, cwd=folder, stdin=subprocess.DEVNULL, stdout=subprocess.PIPE,
                               stderr=subprocess.STDOUT, text=True, errors="replace", start_new_session=True,
                               env={**os.environ, **(env or {})})
    try:
        output, _ = process.communicate(timeout=limit)
        return process.returncode, output
    except subprocess.TimeoutExpired:
        end(process)
        return None, "no end"
    except BaseException:
        end(process)
        raise


def end(process):
    try:
        os.killpg(process.pid, signal.SIGKILL)
    except ProcessLookupError:
        pass
    process.wait()


def source_files():
    listed = subprocess.run(["git", "ls-files", "-co", "--exclude-standard"], cwd=ROOT, capture_output=True, text=True,
                            check=True).stdout.split("\n")
    return [name for name in listed if name and (ROOT / name).is_file()]


class Copy:
    def __init__(self, name, flags="-O0 -w"):
        self.root = FOLDER / name
        self.build = self.root / "build"
        self.flags = flags

    def refresh(self, below=""):
        """Brings the sources (below a folder) up to date; what has not changed keeps its time."""
        wanted = {name for name in source_files() if name.startswith(below)}
        for name in wanted:
            data, place = (ROOT / name).read_bytes(), self.root / name
            if not place.exists() or place.read_bytes() != data:
                place.parent.mkdir(parents=True, exist_ok=True)
                place.write_bytes(data)
                place.chmod((ROOT / name).stat().st_mode)
        for place in (self.root / "tests").rglob("test_*.py"):
            name = str(place.relative_to(self.root))
            if name.startswith(below) and name not in wanted:
                place.unlink()
        self.configure()

    def configure(self):
        argv = ["cmake", "-S", ".", "-B", "build", "-DCMAKE_BUILD_TYPE=Debug", "-DREMVOL_TESTS=ON",
                f"-DCMAKE_CXX_FLAGS_DEBUG={self.flags}", f"-DCMAKE_C_FLAGS_DEBUG={self.flags}"]
        if shutil.which("ninja") and not (self.build / "Makefile").exists():
            argv += ["-G", "Ninja"]
        status, output = run(argv, self.root, 120)
        if status != 0:
            raise SystemExit(f"no build in {self.build}:\n{output[-2000:]}")

    def make(self, *targets, jobs=1):
        status, output = run(["cmake", "--build", "build", f"-j{jobs}", "--target", *targets], self.root, 900)
        return status == 0, output

    def unit(self, name, limit):
        """Runs a unit test up to its first failure, each of its cases in a process of its own, as ctest does."""
        each = """cases=$("$0" --gtest_list_tests) && [ "$cases" ] || exit 1
                  for case in $(echo "$cases" | awk '/^[^ ]/ { suite = $1 } /^ / { print suite $1 }'); do
                      "$0" --gtest_filter="$case" || exit
                  done"""
        return self.fenced(["sh", "-c", each, str(self.build / "bin" / name)], limit, {"GTEST_BRIEF": "1"})

    def cli(self, arguments, limit, jobs):
        workers = ["-n", str(jobs)] if jobs > 1 else []
        return self.fenced(["/usr/bin/python3", "-m", "pytest", "-q", "-p", "no:cacheprovider", "--tb=no", "-rfE",
                            *workers, *arguments], limit, {"REMVOL_BUILD": "build", "PYTHONDONTWRITEBYTECODE": "1"})

    def fenced(self, argv, limit, env):
        return run([*NAMESPACES, str(self.root), *argv], self.root, limit, {**env, "CCACHE_DISABLE": "1"})
