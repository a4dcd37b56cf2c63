"""SNMPv3 managers against Tessel's devices: net-snmp and pysnmp with every level and protocol pair of
the default configuration (profiles/snmpv3.conf), the Reports for security errors, and views."""

import re
import subprocess

import pytest

from conftest import BASE_PORT, PROFILE, Network, lines, snmp, walk

SYS_NAME = "1.3.6.1.2.1.1.5.0"
IF_DESCR_1 = "1.3.6.1.2.1.2.2.1.2.1"
INTERFACES = ".1.3.6.1.2.1.2."
BOUNDED = ("-t", "1", "-r", "1")

# The default configuration's users: name -> net-snmp security options.
USERS = {
    "noauth": ("-l", "noAuthNoPriv"),
    "md5": ("-l", "authNoPriv", "-a", "MD5", "-A", "md5password"),
    "sha": ("-l", "authNoPriv", "-a", "SHA", "-A", "shapassword"),
    "md5des": ("-l", "authPriv", "-a", "MD5", "-A", "md5password", "-x", "DES", "-X", "despassword"),
    "md5aes": ("-l", "authPriv", "-a", "MD5", "-A", "md5password", "-x", "AES", "-X", "aespassword"),
    "shades": ("-l", "authPriv", "-a", "SHA", "-A", "shapassword", "-x", "DES", "-X", "despassword"),
    "shaaes": ("-l", "authPriv", "-a", "SHA", "-A", "shapassword", "-x", "AES", "-X", "aespassword"),
    "restricted": ("-l", "authNoPriv", "-a", "SHA", "-A", "restrictedpw"),
}


def v3(user, *security):
    """net-snmp options for a v3 request as `user`: its own security options unless given."""
    return ("-v3", *BOUNDED, "-u", user, *(security or USERS[user]))


def received_packets(debug_output):
    """The datagrams a net-snmp tool run with -d received, from its hex dumps."""
    packets, current = [], None
    for line in debug_output.splitlines():
        if line.startswith("Received "):
            current = bytearray()
            packets.append(current)
        elif current is not None and re.match(r"[0-9]{4}: ", line):
            current.extend(bytes.fromhex(line[6:57]))
        else:
            current = None
    return [bytes(p) for p in packets]


# A network also binds its trap port, the agent port + 1, on every address: networks that run at
# the same time keep two ports apart.
@pytest.fixture(scope="module")
def v3net():
    net = Network(PROFILE, 2, "127.0.3.41", BASE_PORT + 3)
    yield net
    assert net.stop() == 0


@pytest.mark.parametrize("user", ["noauth", "md5", "sha", "md5des", "md5aes", "shades", "shaaes"])
def test_every_level_and_protocol_pair_reads_every_device(v3net, user):
    for device in range(v3net.devices):
        assert lines("snmpget", *v3(user), v3net.agent(device), SYS_NAME) == [f'.{SYS_NAME} = STRING: "edge-router"']


def test_authpriv_walks_match_the_community_walk(v3net):
    agent = v3net.agent(1)
    expected = walk("snmpwalk", agent, "-v2c", "-c", "public", *BOUNDED)
    assert len(expected) > 300
    assert walk("snmpwalk", agent, *v3("shaaes")) == expected
    assert walk("snmpbulkwalk", agent, *v3("md5des"), "-Cr25") == expected


def with_password(user, flag, password):
    security = list(USERS[user])
    security[security.index(flag) + 1] = password
    return v3(user, *security)


def test_security_errors_get_reports_that_net_snmp_names_and_no_plaintext(v3net):
    cases = [
        (with_password("md5", "-A", "notthepassword"), "Authentication failure"),
        (with_password("shaaes", "-A", "md5password"), "Authentication failure"),
        (v3("nobody", "-l", "noAuthNoPriv"), "Unknown user name"),
        (v3("noauth", "-l", "authNoPriv", "-a", "MD5", "-A", "md5password"), "Unsupported security level"),
        (v3("sha", "-l", "authPriv", "-a", "SHA", "-A", "shapassword", "-x", "AES", "-X", "aespassword"),
         "Unsupported security level"),
        (with_password("md5des", "-X", "wrongprivpass"), "Decryption error"),
        (with_password("shaaes", "-X", "wrongprivpass"), "Decryption error"),
    ]
    for options, message in cases:
        result = snmp("snmpget", "-d", *options, v3net.agent(0), SYS_NAME, check=False)
        assert result.returncode != 0 and message in result.stderr, (options, result.stderr)
        packets = received_packets(result.stdout + result.stderr)
        assert packets and all(b"edge-router" not in p for p in packets), "the agent answered with Reports"


def test_views_limit_reads_walks_and_sets(v3net):
    agent = v3net.agent(1)
    assert lines("snmpget", *v3("restricted"), agent, SYS_NAME) == [f'.{SYS_NAME} = STRING: "edge-router"']
    refused = snmp("snmpget", *v3("restricted"), agent, IF_DESCR_1, check=False)
    assert "authorizationError" in refused.stderr + refused.stdout

    full = walk("snmpwalk", agent, *v3("sha"))
    restricted = walk("snmpwalk", agent, *v3("restricted"))
    assert any(l.startswith(INTERFACES) for l in full)
    assert restricted == [l for l in full if not l.startswith(INTERFACES)]

    assert lines("snmpset", *v3("restricted"), agent, "1.3.6.1.2.1.1.4.0", "s", "v3 ops") == [
        '.1.3.6.1.2.1.1.4.0 = STRING: "v3 ops"']
    outside = snmp("snmpset", *v3("restricted"), agent, "1.3.6.1.2.1.4.1.0", "i", "2", check=False)
    assert outside.returncode != 0 and "authorizationError" in outside.stderr + outside.stdout


def test_pysnmp_reads_at_every_level(v3net):
    host, port = v3net.agent(0).split(":")
    script = f"""
from pysnmp.hlapi import *
for user in (UsmUserData("noauth"), UsmUserData("md5des", "md5password", "despassword"),
             UsmUserData("shaaes", "shapassword", "aespassword", authProtocol=usmHMACSHAAuthProtocol,
                         privProtocol=usmAesCfb128Protocol)):
    error, status, index, binds = next(getCmd(SnmpEngine(), user, UdpTransportTarget(("{host}", {port}),
        timeout=1, retries=1), ContextData(), ObjectType(ObjectIdentity("{SYS_NAME}"))))
    print(error or status or binds[0][1].prettyPrint())
"""
    result = subprocess.run(["/usr/bin/python3", "-c", script], capture_output=True, text=True, timeout=60)
    assert result.stdout.split() == ["edge-router"] * 3, result.stdout + result.stderr


def test_engine_objects_tell_the_agents_identity(v3net):
    agent = v3net.agent(0)
    walked = [l.split(" = ", 1) for l in lines("snmpwalk", *v3("md5"), agent, "1.3.6.1.6.3") if "No more" not in l]
    assert [name for name, _ in walked] == [f".1.3.6.1.6.3.{group}{i}.0" for group, count in
                                            (("10.2.1.", 4), ("11.2.1.", 3), ("15.1.1.", 6))
                                            for i in range(1, count + 1)]
    engine_id, boots, _, size = (value for _, value in walked[:4])
    assert (engine_id, boots, size) == (f'STRING: "{agent.replace(":", "#")}"', "INTEGER: 1", "INTEGER: 19989")
