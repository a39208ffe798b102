"""A world of the measurements' own: the installed product, folders in memory where it keeps its files, a tree."""

import contextlib
import os
import pathlib
import subprocess
import time

BUILD = pathlib.Path(os.environ["REMVOL_BUILD"]).resolve()
PRODUCT = pathlib.Path("/mnt/product")
SOCKET = "/run/ktree_sock_vv"
WORK = pathlib.Path("/mnt/disk")  # on the disk that the build is on


def enter():
    """Called once, in mount, process and IPC namespaces of its own."""
    disk = BUILD / "bench-work"
    disk.mkdir(exist_ok=True)
    keep = os.open(disk, os.O_PATH)
    mount("tmpfs", "/mnt")
    for folder in (WORK, PRODUCT):
        folder.mkdir()
    subprocess.run(["mount", "--bind", f"/proc/self/fd/{keep}", WORK], check=True, pass_fds=[keep])
    subprocess.run(["cmake", "--install", BUILD, "--prefix", PRODUCT], check=True, stdout=subprocess.DEVNULL,
                   env={**os.environ, "DESTDIR": ""})
    subprocess.run(["cp", *BUILD.glob("bin/bench_*"), PRODUCT / "bin"], check=True)
    library = next(PRODUCT.rglob("libktreec.so")).parent
    os.environ["LD_LIBRARY_PATH"] = str(library)  # for the measuring programs; ours find it by themselves
    os.environ["PATH"] = f"/mnt/fakes:{PRODUCT}/bin:{PRODUCT}/sbin:{os.environ['PATH']}"
    pathlib.Path("/mnt/fakes").mkdir()
    mount("tmpfs", "/run")
    pathlib.Path("/run/lock").mkdir(mode=0o1777)
    for folder in ("upper", "work"):
        pathlib.Path("/mnt", folder).mkdir()
    subprocess.run(["mount", "-t", "overlay", "etc", "-o", "lowerdir=/etc,upperdir=/mnt/upper,workdir=/mnt/work", "/etc"],
                   check=True)
    pathlib.Path("/etc/NAS_CFG").mkdir(exist_ok=True)
    mount("tmpfs", "/etc/NAS_CFG")


def mount(kind, path):
    subprocess.run(["mount", "-t", kind, kind, path], check=True)


def program(name):
    return str(next(path for path in (PRODUCT / "bin" / name, PRODUCT / "sbin" / name) if path.exists()))


def output(*command, **options):
    return subprocess.run([str(part) for part in command], check=True, stdout=subprocess.PIPE, text=True, **options).stdout


@contextlib.contextmanager
def server(command, socket):
    process = subprocess.Popen([str(part) for part in command], stdout=subprocess.DEVNULL)
    try:
        until(lambda: pathlib.Path(socket).exists())
        yield process
    finally:
        process.terminate()
        process.wait()


def ktree(socket=SOCKET, name="config"):
    return server([program("ktree"), "-n", name, "-s", socket], socket)


def redis(socket="/run/redis"):
    return server(["redis-server", "--port", "0", "--unixsocket", socket, "--save", "", "--appendonly", "no"], socket)


def until(there):
    for _ in range(500):
        if there():
            return
        time.sleep(0.01)
    raise TimeoutError


def load(text, socket=SOCKET):
    """Makes the tree what the settings document says."""
    file = WORK / "load.xml"
    file.write_text(text)
    output(program("ktreec"), "-S", socket, "-l", file)


def resident(process):
    status = pathlib.Path(f"/proc/{process.pid}/status").read_text()
    return next(int(line.split()[1]) for line in status.splitlines() if line.startswith("VmRSS:"))


@contextlib.contextmanager
def one_processor():
    """What is started in here, servers too, has one processor: a run and its commands follow one another anyhow."""
    all_of_them = os.sched_getaffinity(0)
    os.sched_setaffinity(0, {0})
    try:
        yield
    finally:
        os.sched_setaffinity(0, all_of_them)


def in_turn(rounds, *commands):
    """Runs the commands in turn. Returns the microseconds of each round, and the KiB at most resident, of each command."""
    arguments = [str(part) for command in commands for part in ("--", *command)][1:]
    *lines, last = output(program("bench_spawn"), rounds, *arguments).splitlines()
    times = [[float(value) for value in line.split()] for line in lines]
    return list(zip(*times)), [int(value) for value in last.split()]
