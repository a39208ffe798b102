"""Whole runs of our programs beside the programs of the system."""

import pathlib
import re
import statistics
import subprocess
import time

from appliance_tree import document, sessions, sessions_in_detail
from figures import Figure, Growth, ratio
from world import in_turn, ktree, load, one_processor, output, program

MOST_KIB = 4096
COMMANDS = "/mnt/commands"
TRACE = "/mnt/trace"


def share_name(short):
    with one_processor(), ktree():
        load(document(8, 8))
        (ours, true), (peak, _) = in_turn(11 if short else 401, [program("remvol"), "--check_share_name", "-s", "X"],
                                          ["/bin/true"])
    yield ratio("Whole runs", "remvol --check_share_name / true", ours, true, 1.5)
    yield Figure("Memory", "remvol --check_share_name, at most resident", peak, MOST_KIB, "KiB")


def volumes(short):
    with one_processor(), ktree():
        load(document(8, 8))
        (ours, true, lsblk), _ = in_turn(5 if short else 201, [program("vvstat")], ["/bin/true"], ["lsblk"])
    yield ratio("Whole runs", "vvstat of 64 volumes / true", ours, true, 2)
    yield ratio("Whole runs", "vvstat of 64 volumes / lsblk", ours, lsblk, 1)


def fake_iscsiadm(targets, luns, details=None):
    fakes = pathlib.Path("/mnt/fakes")
    (fakes / "sessions").write_text(sessions(targets))
    (fakes / "details").write_text(details or sessions_in_detail(targets, luns))
    iscsiadm = fakes / "iscsiadm"
    iscsiadm.write_text("#!/bin/sh\ncase $* in\n*-P*3) cat /mnt/fakes/details ;;\n*) cat /mnt/fakes/sessions ;;\nesac\n")
    iscsiadm.chmod(0o755)


def write_commands(trace):
    """Writes down the shell commands of a run. Returns how many there are."""
    commands = re.findall(r'execve\("/bin/sh", \["sh", "-c", (?:"--", )?"((?:[^"\\]|\\.)*)"\]', trace)
    lines = [command.encode().decode("unicode_escape") for command in commands]
    pathlib.Path(COMMANDS).write_text("".join(line + "\n" for line in lines))
    return len(lines)


def traced(command):
    """Runs the command. Returns how many shell commands it took, which are written down, and requests to the tree."""
    ended = subprocess.run(["strace", "-f", "-qq", "-s", "4096", "-e", "trace=execve,sendmsg", "-o", TRACE, *command],
                           stdout=subprocess.DEVNULL).returncode
    if ended not in (0, 1):  # vvstat says with 1 that not all is well
        raise RuntimeError(f"{command} ended with {ended}")
    text = pathlib.Path(TRACE).read_text()
    return write_commands(text), text.count("sendmsg(")


def status_beside_commands(targets, luns, rounds):
    """The tool beside its shell commands alone, run by the same system calls. Returns the times of both, the most memory
    of the run, and how many commands and requests it took."""
    fake_iscsiadm(targets, luns)
    tool = [program("remvol"), "--status"]
    with one_processor(), ktree():
        load(document(targets, luns))
        output(*tool)
        commands, requests = traced(tool)
        (ours, alone), (peak, _) = in_turn(rounds, tool, [program("bench_system"), COMMANDS])
    return ours, alone, peak, commands, requests


def status(short):
    ours, alone, peak, commands, requests = status_beside_commands(8, 8, 5 if short else 101)
    figure = ratio("Whole runs", "remvol --status, 8 targets and 64 LUNs / its commands alone", ours, alone, 1.1)
    figure.detail += f"; {commands} commands, {requests} requests to the tree"
    yield figure
    yield Figure("Memory", "remvol --status, at most resident", peak, MOST_KIB, "KiB")
    rounds = 2 if short else 21
    for name, title, sizes in (("targets", "--status of targets with one LUN", [(n, 1) for n in (1, 2, 4, 6, 8)]),
                               ("luns", "--status of 8 targets", [(8, m) for m in (1, 2, 4, 6, 8)])):
        points = []
        for targets, luns in sizes if not short else sizes[:2]:
            ours, alone, *_ = status_beside_commands(targets, luns, rounds)
            points.append((targets * luns, statistics.median(ours) / 1000, statistics.median(alone) / 1000))
        yield Growth(name, title, "LUNs", "milliseconds", points, "its commands alone")


def size(short):
    del short
    copy = "/mnt/remvol.stripped"
    output("strip", "-o", copy, program("remvol"))
    yield Figure("Size", "remvol, stripped", pathlib.Path(copy).stat().st_size / 1024, 150, "KiB")
    needed = re.findall(r"NEEDED.*\[(.*)\]", output("readelf", "-d", program("remvol")))
    yield Figure("Size", "libraries that remvol opens", len(needed), detail=", ".join(needed))


def idle(short):
    """System calls of a daemon that nobody asks anything."""
    seconds = 2 if short else 600
    with ktree() as tree:
        listener = subprocess.Popen([program("remvol-events")], stderr=subprocess.DEVNULL)
        time.sleep(1)
        traces = []
        for name, process in (("ktree", tree), ("remvol-events", listener)):
            file = f"/mnt/idle.{name}"
            traces.append((name, file, subprocess.Popen(["strace", "-f", "-qq", "-o", file, "-p", str(process.pid)])))
        time.sleep(seconds)
        for name, file, tracer in traces:
            tracer.terminate()
            tracer.wait()
            lines = pathlib.Path(file).read_text().splitlines()
            calls = [line for line in lines if "resumed" not in line and "detached" not in line and "---" not in line]
            yield Figure("Idle", f"system calls of {name} in {seconds} seconds", len(calls), 0)
        listener.terminate()
        listener.wait()


def instructions(short):
    """What does not depend on the machine's other work."""
    del short
    fake_iscsiadm(8, 8)
    with one_processor(), ktree():
        load(document(8, 8))
        for command in (["remvol", "--check_share_name", "-s", "X"], ["remvol", "--status"], ["vvstat"], ["vvstat", "--json"]):
            said = subprocess.run(["valgrind", "--tool=callgrind", "--callgrind-out-file=/dev/null", program(command[0]),
                                   *command[1:]], stdout=subprocess.DEVNULL, stderr=subprocess.PIPE, text=True).stderr
            collected = int(re.search(r"Collected : (\d+)", said).group(1))
            yield Figure("Instructions", " ".join(command) + ", 8 targets and 64 LUNs", collected / 1e6, unit="million")


