"""Managers talk to Tessel's devices exactly as to snmpsim serving the same recorded data."""

import socket
import subprocess
import sys

from conftest import BASE_PORT, Network, Simulator, lines, snmp


ENGINE_OBJECTS = "1.3.6.1.6.3."


def walk(tool, version, endpoint, *extra):
    """The objects a walk returns, without the end-of-MIB markers a bulk reply may repeat and without
    the engine's own SNMPv3 objects (snmpEngine, snmpMPDStats, usmStats), which recorded data lacks."""
    return [l for l in lines(tool, f"-v{version}", "-c", "public", *extra, endpoint, "1.3")
            if "No more variables left" not in l and l != "End of MIB" and not l.startswith("." + ENGINE_OBJECTS)]


def test_walks_match_snmpsim(network, simulator):
    expected = walk("snmpwalk", "2c", simulator.endpoint)
    assert len(expected) > 300
    for device in range(network.devices):
        assert walk("snmpwalk", "2c", network.agent(device)) == expected
    assert walk("snmpbulkwalk", "2c", network.agent(1), "-Cr25") == walk("snmpbulkwalk", "2c", simulator.endpoint,
                                                                         "-Cr25")


def test_snmpv1_walk_leaves_out_counter64(network, simulator):
    v2 = walk("snmpwalk", "2c", simulator.endpoint)
    assert walk("snmpwalk", "1", network.agent(0)) == [l for l in v2 if "Counter64" not in l]


def test_get_getnext_and_errors(network):
    agent = network.agent(2)
    got = lines("snmpget", "-v2c", "-c", "public", agent, "1.3.6.1.2.1.1.5.0", "1.3.6.1.2.1.2.2.1.2.2",
                "1.3.6.1.2.1.1.99.0", "1.3.6.1.2.1.2.2.1.2.99")
    assert got == ['.1.3.6.1.2.1.1.5.0 = STRING: "edge-router"',
                   '.1.3.6.1.2.1.2.2.1.2.2 = STRING: "GigabitEthernet0/0"',
                   ".1.3.6.1.2.1.1.99.0 = No Such Object available on this agent at this OID",
                   ".1.3.6.1.2.1.2.2.1.2.99 = No Such Instance currently exists at this OID"]
    assert lines("snmpgetnext", "-v2c", "-c", "private", agent, "1.3.6.1.2.1.2.2.1.2.5") == [
        ".1.3.6.1.2.1.2.2.1.3.1 = INTEGER: 24"]
    v1 = snmp("snmpget", "-v1", "-c", "public", agent, "1.3.6.1.2.1.1.99.0", check=False)
    assert "noSuchName" in v1.stderr + v1.stdout
    wrong = snmp("snmpget", "-v2c", "-c", "nobody", "-t", "0.5", "-r", "0", agent, "1.3.6.1.2.1.1.5.0",
                 check=False)
    assert wrong.returncode != 0 and "Timeout" in wrong.stderr


def test_set_changes_one_device_only(network):
    first, second = network.agent(0), network.agent(1)
    snmp("snmpset", "-v2c", "-c", "private", first, "1.3.6.1.2.1.1.4.0", "s", "ops team")
    assert lines("snmpget", "-v2c", "-c", "public", first, "1.3.6.1.2.1.1.4.0") == [
        '.1.3.6.1.2.1.1.4.0 = STRING: "ops team"']
    assert lines("snmpget", "-v2c", "-c", "public", second, "1.3.6.1.2.1.1.4.0") == [
        '.1.3.6.1.2.1.1.4.0 = STRING: "noc@example.net"']
    refused = snmp("snmpset", "-v2c", "-c", "public", "-t", "0.5", "-r", "0", first, "1.3.6.1.2.1.1.4.0", "s",
                   "x", check=False)
    assert refused.returncode != 0, "a read community cannot set"
    readonly = snmp("snmpset", "-v1", "-c", "private", first, "1.3.6.1.2.1.1.99.0", "i", "1", check=False)
    assert "noSuchName" in readonly.stderr + readonly.stdout


def test_refused_set_changes_nothing(network):
    agent = network.agent(2)
    for version, reason in (("2c", "wrongType"), ("1", "badValue")):
        refused = snmp("snmpset", "-On", f"-v{version}", "-c", "private", agent, "1.3.6.1.2.1.1.4.0", "s", "x",
                       "1.3.6.1.2.1.1.6.0", "i", "5", check=False)
        assert reason in refused.stderr and "Failed object: .1.3.6.1.2.1.1.6.0" in refused.stderr
    assert lines("snmpget", "-v2c", "-c", "public", agent, "1.3.6.1.2.1.1.4.0") == [
        '.1.3.6.1.2.1.1.4.0 = STRING: "noc@example.net"']


def test_pysnmp_walks_the_same_objects(network):
    script = f"""
from pysnmp.hlapi import *
host, port = "{network.agent(1)}".split(":")
for error, status, index, binds in nextCmd(SnmpEngine(), CommunityData("public", mpModel=1),
        UdpTransportTarget((host, int(port)), timeout=2, retries=1), ContextData(),
        ObjectType(ObjectIdentity("1.3")), lexicographicMode=True):
    assert not error and not status, (error, status)
    for name, value in binds:
        print(".".join(str(x) for x in name.asTuple()))
"""
    result = subprocess.run(["/usr/bin/python3", "-c", script], capture_output=True, text=True, timeout=120)
    assert result.returncode == 0, result.stderr
    expected = [l.split(" = ")[0].lstrip(".") for l in walk("snmpwalk", "2c", network.agent(1))]
    assert [n for n in result.stdout.split() if not n.startswith(ENGINE_OBJECTS)] == expected


def test_malformed_datagrams_leave_the_agent_answering(network):
    host, port = network.agent(0).split(":")
    with socket.socket(socket.AF_INET, socket.SOCK_DGRAM) as s:
        for garbage in (b"", b"\x30", b"\x30\x84\xff\xff\xff\xff", b"\x30\x03\x02\x01\x05" * 50, bytes(range(256))):
            s.sendto(garbage, (host, int(port)))
    assert lines("snmpget", "-v2c", "-c", "public", network.agent(0), "1.3.6.1.2.1.1.5.0")


def test_snmpwalk_output_serves_as_device_data(tmp_path, simulator):
    recorded = tmp_path / "recorded.walk"
    recorded.write_text(snmp("snmpwalk", "-v2c", "-c", "public", "-On", simulator.endpoint, "1.3").stdout)
    net = Network(recorded, 1, "127.0.3.20", BASE_PORT + 2)
    try:
        assert walk("snmpwalk", "2c", net.agent(0)) == walk("snmpwalk", "2c", simulator.endpoint)
    finally:
        assert net.stop() == 0
