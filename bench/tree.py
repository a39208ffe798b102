"""The configuration tree beside a bare echo, redis-server and xmllint."""

import os
import statistics
import subprocess

from appliance_tree import wide
from figures import Figure, Growth, ratio
from world import SOCKET, WORK, in_turn, ktree, load, output, program, redis, resident

REDIS = "/run/redis"
PATH, VALUE = "/iscsi/initiator/id:3/status", "Connected, the volume is mounted and in use"
NODES = 100_000
NODE_TEXT = len("b") + len("a value of thirty-two characters")


def pin(process, processors):
    subprocess.run(["taskset", "-apc", processors, str(process.pid)], check=True, stdout=subprocess.DEVNULL)


def round_trips(short):
    """One client, in the three placements of two processes."""
    both = f"0-{os.cpu_count() - 1}"
    with ktree() as ours, redis() as theirs:
        for where, own, servers, most in (("where the scheduler puts them", both, both, 1.2),
                                          ("on one processor", "0", "0", 1.2), ("on two processors", "0", "1", 1.3)):
            if servers == "1" and os.cpu_count() == 1:
                continue
            pin(ours, servers)
            pin(theirs, servers)
            names, *rows = output(program("bench_tree"), SOCKET, REDIS, own, servers, 11 if short else 1001).splitlines()
            costs = dict(zip(names.split("\t"), zip(*([float(value) for value in row.split("\t") if value] for row in rows))))
            for call, echo, peer in (("ktreec_set", "echo of a set", "redis SET"), ("ktreec_get_wb", "echo of a get", "redis GET"),
                                     ("ktreec_get_wb in vain", "echo of a get in vain", "redis GET in vain")):
                group = f"One client, {where}"
                yield ratio(group, f"{call} / a bare echo", costs[call], costs[echo], most)
                yield ratio(group, f"{call} / {peer}", costs[call], costs[peer], 0.95)
        yield Figure("Memory", "resident with 8 targets and 8 LUNs, ktree / redis-server", resident(ours) / resident(theirs),
                     0.2, detail=f"{resident(ours)} and {resident(theirs)} KiB")


def many_clients(short):
    points = []
    milliseconds, rounds = (30, 1) if short else (300, 9)
    with ktree(), redis():
        output(program("ktreec"), "-S", SOCKET, "-s", PATH, VALUE)
        output("redis-cli", "-s", REDIS, "SET", PATH, VALUE)

        def rate(kind, socket, clients):
            return float(output(program("bench_clients"), clients, milliseconds, kind, socket, PATH, VALUE))

        for clients in (1, 2, 4, 8, 16, 32, 64, 128, 256):
            pairs = [(rate("ktree", SOCKET, clients), rate("redis", REDIS, clients)) for _ in range(rounds)]
            ours, theirs = (statistics.median(values) for values in zip(*pairs))
            points.append((clients, ours, theirs))
            if clients in (8, 64, 256):
                yield Figure("Many clients", f"replies a second with {clients} clients, ktree / redis-server",
                             statistics.median(a / b for a, b in pairs), least=1.3,
                             detail=f"{ours:,.0f} and {theirs:,.0f}, medians of {rounds} rounds")
    yield Growth("clients", "Many clients at once", "clients", "replies a second", points, "redis-server")


def node_number(number):
    return f"/bulk/a:{(number - 1) // 4000 + 1}/b:{(number - 1) % 4000 + 1}"


def nodes(short):
    """What other nodes cost."""
    counts = (10, 100, 1000) if short else (10, 100, 1000, 10_000, NODES)
    costs = {}
    with ktree("/run/few", "few") as few, ktree("/run/many", "many") as many:
        empty = resident(many)
        load(wide(100), "/run/few")
        for count in counts:
            load(wide(count), "/run/many")
            rows = output(program("bench_get"), 21 if short else 1001, 32, "/run/few", node_number(50), "/run/many",
                          node_number(count)).splitlines()
            costs[count] = list(zip(*([float(value) for value in row.split()] for row in rows)))
        most = counts[-1]
        yield ratio("Other nodes", f"a read among {most:,} nodes / among 100", costs[most][1], costs[most][0], 1.1)
        yield Figure("Memory", f"bytes a node over its own text, {most:,} nodes",
                     (resident(many) - empty) * 1024 / most - NODE_TEXT, 200)
    yield Growth("nodes", "A read among so many nodes", "nodes", "microseconds",
                 [(count, statistics.median(costs[count][1])) for count in counts])


def settings(short):
    """Dump and load of whole trees, beside a program that only reads the file."""
    rounds = 3 if short else 15
    points = {"dump": [], "load": []}
    with ktree():
        for count in ((10, 1000) if short else (10, 1000, 10_000, 50_000, NODES, 200_000)):
            load(wide(count))
            file = WORK / "settings.xml"
            output(program("ktreec"), "-S", SOCKET, "-D", file)
            dumped = WORK / "dump.xml"
            (dump, reload, lint, _), _ = in_turn(
                rounds, [program("ktreec"), "-S", SOCKET, "-D", dumped],
                [program("ktreec"), "-S", SOCKET, "-l", file], ["xmllint", "--noout", file],
                ["truncate", "--size=-1", dumped])  # a file that is as it should be would stay
            megabytes = file.stat().st_size / 1e6
            for name, times in (("dump", dump), ("load", reload)):
                points[name].append((megabytes, statistics.median(times) / 1000, statistics.median(lint) / 1000))
                if count in (1000 if short else NODES,):
                    yield ratio("Settings files", f"{name} of {count:,} nodes / xmllint --noout", times, lint, 1.0)
    for name, title in (("dump", "A dump with its sync"), ("load", "A load")):
        yield Growth(name, title, "megabytes", "milliseconds", points[name], "xmllint")


def values(short):
    points = []
    sizes = (1, 1024) if short else (1, 16, 256, 1024, 4096, 16384, 65535)
    with ktree(), redis():
        for size in sizes:
            load(f"<config><v>{'x' * size}</v></config>")
            rows = output(program("bench_get"), 11 if short else 301, 32, SOCKET, "/v").split()
            points.append((size, statistics.median(float(row) for row in rows)))
    yield Growth("values", "A read of a value", "bytes", "microseconds", points)
