"""A `ktree` of a test's own, in a short folder (the path of a socket may not be long), and the frames it speaks."""
import os
import pathlib
import shutil
import signal
import socket
import struct
import subprocess
import tempfile
import time

from .under import SLOWER, keep, under

BUILD = pathlib.Path(os.environ.get("REMVOL_BUILD", pathlib.Path(__file__).parents[3] / "build/release")).resolve()
KTREE = BUILD / "bin/ktree"
KTREEC = BUILD / "bin/ktreec"
GET, SET, DEL, DUMP, LOAD, LIST, MIRROR = range(1, 8)

# strace and the leak checker of the address sanitizer do not go together.
TRACED = {**os.environ, "ASAN_OPTIONS": "detect_leaks=0"}


def until(condition, seconds=20 * SLOWER):
    """Waits until condition() is true and returns what it gave; fails when that takes too long."""
    end = time.monotonic() + seconds
    while True:
        result = condition()
        if result:
            return result
        assert time.monotonic() < end, "waited in vain"
        time.sleep(0.01)


class Daemon:
    def __init__(self, name="config", prefix=(), start=True, **popen):
        self.folder = pathlib.Path(tempfile.mkdtemp(prefix="ktree."))
        self.folder.chmod(0o755)
        self.socket = self.folder / "sock"
        self.name = name
        self.pid_file = self.folder / f"sock_{name}.pid"
        self.process = None
        if start:
            self.start(prefix, **popen)

    def start(self, prefix=(), arguments=(), **popen):
        words = under([KTREE, "-n", self.name, "-s", self.socket, *arguments], BUILD, self.folder / "found")
        self.process = subprocess.Popen([*prefix, *words],
                                        stdin=subprocess.DEVNULL, **popen)
        until(self.answers)

    def answers(self):
        assert self.process.poll() is None, "the daemon ended"
        with socket.socket(socket.AF_UNIX) as client:
            return client.connect_ex(str(self.socket)) == 0

    def pid(self):
        """The daemon's own process, which may be another one than what was started; written a moment after it answers."""
        return int(until(lambda: self.pid_file.exists() and self.pid_file.read_text()))

    def stop(self, number=signal.SIGTERM):
        self.process.send_signal(number)
        return self.process.wait(20)

    def close(self):
        if self.process is not None and self.process.poll() is None:
            self.process.kill()
            self.process.wait()
        keep(self.folder.glob("found.*"), os.environ.get("PYTEST_CURRENT_TEST", "").rpartition(" ")[0])
        shutil.rmtree(self.folder)

    def cpu_ticks(self):
        fields = pathlib.Path(f"/proc/{self.pid()}/stat").read_text().rpartition(")")[2].split()
        return int(fields[11]) + int(fields[12])

    def run(self, *args, **options):
        words = under([KTREEC, "-S", self.socket, *args], BUILD, self.folder / "found")
        return subprocess.run(words, capture_output=True, timeout=60 * SLOWER, **options)

    def set(self, path, value):
        assert self.run("-s", path, value).returncode == 0, path

    def get(self, path):
        done = self.run("-g", path)
        return done.stdout[:-1] if done.returncode == 0 else None

    def listing(self, *path):
        return self.run("-t", *path).stdout.decode().splitlines()

    def connect(self):
        client = socket.socket(socket.AF_UNIX)
        client.settimeout(20)
        client.connect(str(self.socket))
        return client


def frame(operation, path=b"", value=b""):
    return struct.pack("=IBBH", 4 + len(path) + len(value), operation, 0, len(path)) + path + value


def get_frame(path, most=65535):
    return frame(GET, path, struct.pack("=I", most))


def receive(client):
    """One reply: its status and its body; None when the daemon closed the connection."""
    data = b""
    while len(data) < 8 or len(data) < 4 + struct.unpack_from("=I", data)[0]:
        try:
            part = client.recv(1 << 17)
        except ConnectionResetError:
            return None
        if not part:
            return None
        data += part
    return data[4], data[8:]


def ask(client, request):
    try:
        client.sendall(request)
    except BrokenPipeError:
        return None
    return receive(client)
