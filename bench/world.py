"""A world of the measurements' own: the installed product, folders in memory where it keeps its files, a tree."""

import contextlib
import os
import pathlib
import subprocess
import time

BUILD = pathlib.Path(os.environ["REMVOL_BUILD"]).resolve()
PRODUCT = pathlib.Path("/usr")
SOCKET = "/run/ktree_sock_vv"
WORK = pathlib.Path("/mnt/disk")  # on the disk that the build is on


def enter():
    """Called once, in mount, process and IPC namespaces of its own."""
    disk = BUILD / "bench-work"
    disk.mkdir(exist_ok=True)
    keep = os.open(disk, os.O_PATH)
    mount("tmpfs", "/mnt")
    WORK.mkdir()
    subprocess.run(["mount", "--bind", f"/proc/self/fd/{keep}", WORK], check=True, pass_fds=[keep])
    cover(PRODUCT)
    install()
    os.environ["PATH"] = f"/mnt/fakes:{os.environ['PATH']}"
    pathlib.Path("/mnt/fakes").mkdir()
    mount("tmpfs", "/run")
    pathlib.Path("/run/lock").mkdir(mode=0o1777)
    cover(pathlib.Path("/etc"))
    pathlib.Path("/etc/NAS_CFG").mkdir(exist_ok=True)
    mount("tmpfs", "/etc/NAS_CFG")


def cover(folder):
    """What is changed in the folder from now on goes to memory."""
    over = pathlib.Path("/mnt/over", folder.name)
    for part in ("upper", "work"):
        (over / part).mkdir(parents=True)
    subprocess.run(["mount", "-t", "overlay", "over", "-o",
                    f"lowerdir={folder},upperdir={over / 'upper'},workdir={over / 'work'}", folder], check=True)


def install():
    """As the package does: where the loader looks by itself, and without search paths of the programs' own."""
    subprocess.run(["cmake", "--install", BUILD, "--prefix", PRODUCT], check=True, stdout=subprocess.DEVNULL,
                   env={**os.environ, "DESTDIR": ""})
    manifest = map(pathlib.Path, (BUILD / "install_manifest.txt").read_text().split())
    drop_search_paths(path for path in manifest if path.parent.name in ("bin", "sbin"))
    subprocess.run(["cp", *BUILD.glob("bin/bench_*"), PRODUCT / "bin"], check=True)
    subprocess.run(["ldconfig"], check=True)


def drop_search_paths(programs):
    script = pathlib.Path("/mnt/no_search_path.cmake")
    script.write_text("".join(f'file(RPATH_REMOVE FILE "{path}")\n' for path in programs))
    output("cmake", "-P", script, stderr=subprocess.DEVNULL)


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
