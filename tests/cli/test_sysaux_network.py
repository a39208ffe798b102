"""LAN ports, hardware addresses and the host name, in a network of the test's own."""

import subprocess

import pytest
from harness.sysaux import CALL, run


@pytest.fixture
def network():
    """Runs a command in a network namespace that has the pair egiga0 and peer0."""
    holder = subprocess.Popen(
        ["unshare", "--net", "--uts", "sh", "-c", "echo ready; read wait"],
        stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True,
    )
    assert holder.stdout.readline() == "ready\n"

    def inside(*command):
        return run("nsenter", f"--target={holder.pid}", "--net", "--uts", *command)

    inside("ip", "link", "add", "egiga0", "address", "00:90:a9:1b:2c:3d", "type", "veth", "peer", "name", "peer0")
    yield inside
    holder.stdin.close()
    holder.wait(10)


def link_speed(network, port):
    return int(network(CALL, "link_speed", port))


@pytest.mark.native
def test_a_port_has_a_link_when_both_ends_are_up(network):
    assert link_speed(network, 0) == 0
    network("ip", "link", "set", "egiga0", "up")
    assert link_speed(network, 0) == 0  # the other end is down
    network("ip", "link", "set", "peer0", "up")
    assert link_speed(network, 0) == 10000  # what the driver of a veth pair tells
    network("ip", "link", "set", "peer0", "down")
    assert link_speed(network, 0) == 0


def test_a_link_of_unknown_speed_counts_as_1000(network):
    network("ip", "link", "add", "egiga1", "type", "bridge")  # without ports it has a link and no speed
    assert link_speed(network, 1) == 0
    network("ip", "link", "set", "egiga1", "up")
    assert link_speed(network, 1) == 1000


@pytest.mark.parametrize("port", [0, 1])
def test_a_missing_port_has_no_link(network, port):
    network("ip", "link", "delete", "egiga0")
    assert link_speed(network, port) == 0


@pytest.mark.parametrize("port", [-1, 2, 99])
def test_other_ports_have_no_link(network, port):
    assert link_speed(network, port) == 0


def test_the_hardware_address_of_an_interface(network):
    assert network(CALL, "mac_addr", "egiga0") == "0 00:90:a9:1b:2c:3d\n"


@pytest.mark.parametrize("name", ["egiga1", "", "lo", "a name that is longer than an interface may have", "egiga0 "])
def test_no_hardware_address(network, name):
    assert network(CALL, "mac_addr", name) == "-1 00:00:00:00:00:00\n"


def test_the_host_name_is_given_when_it_fits(network):
    network("hostname", "NAS-Box")
    assert network(CALL, "hostname", 256) == "0 NAS-Box\n"
    assert network(CALL, "hostname", 8) == "0 NAS-Box\n"
    assert network(CALL, "hostname", 7) == "-1 \n"
    assert network(CALL, "hostname", 0) == "-1 \n"
    network("hostname", "x" * 64)
    assert network(CALL, "hostname", 256) == f"0 {'x' * 64}\n"


def test_an_empty_host_name_fails(network):
    network("sh", "-c", "/usr/bin/python3 -c 'import socket; socket.sethostname(\"\")'")
    assert network(CALL, "hostname", 256) == "-1 \n"
