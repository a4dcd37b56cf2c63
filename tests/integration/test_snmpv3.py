"""SNMPv3 managers against Tessel's devices: net-snmp and pysnmp with every level and protocol pair of
the default configuration (profiles/snmpv3.conf), the Reports for security errors, and views."""

import re
import subprocess
import time

import pytest

from conftest import BASE_PORT, PROFILE, Network, launcher_command, lines, snmp

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


def walk(tool, endpoint, *options):
    """A walk without the engine's own objects, whose counters and time move with every exchange."""
    return [l for l in lines(tool, *options, endpoint, "1.3")
            if "No more variables left" not in l and l != "End of MIB" and not l.startswith(".1.3.6.1.6.3.")]


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
        assert lines("snmpget", *v3(user), v3net.agent(device), SYS_NAME) == [
            f'.{SYS_NAME} = STRING: "edge-router"']
        assert lines("snmpgetnext", *v3(user), v3net.agent(device), "1.3.6.1.2.1.1.4.0") == [
            f'.{SYS_NAME} = STRING: "edge-router"']


def test_authpriv_walks_match_the_community_walk(v3net):
    agent = v3net.agent(1)
    expected = walk("snmpwalk", agent, "-v2c", "-c", "public", *BOUNDED)
    assert len(expected) > 300
    assert walk("snmpwalk", agent, *v3("shaaes")) == expected
    assert walk("snmpbulkwalk", agent, *v3("md5des"), "-Cr25") == expected


def test_security_errors_get_reports_that_net_snmp_names(v3net):
    agent = v3net.agent(0)
    cases = [
        (v3("md5", "-l", "authNoPriv", "-a", "MD5", "-A", "notthepassword"), "Authentication failure"),
        (v3("shaaes", "-l", "authPriv", "-a", "SHA", "-A", "md5password", "-x", "AES", "-X", "aespassword"),
         "Authentication failure"),
        (v3("nobody", "-l", "noAuthNoPriv"), "Unknown user name"),
        (v3("noauth", "-l", "authNoPriv", "-a", "MD5", "-A", "md5password"), "Unsupported security level"),
        (v3("sha", "-l", "authPriv", "-a", "SHA", "-A", "shapassword", "-x", "AES", "-X", "aespassword"),
         "Unsupported security level"),
    ]
    for options, message in cases:
        result = snmp("snmpget", *options, agent, SYS_NAME, check=False)
        assert result.returncode != 0 and message in result.stderr, (options, result.stderr)
        assert "edge-router" not in result.stdout


@pytest.mark.parametrize("user,cipher", [("md5des", "DES"), ("shaaes", "AES")])
def test_wrong_privacy_password_yields_no_plaintext(v3net, user, cipher):
    security = list(USERS[user])
    security[security.index("-X") + 1] = "wrongprivpass"
    result = snmp("snmpget", "-d", *v3(user, *security), v3net.agent(0), SYS_NAME, check=False)
    assert result.returncode != 0 and "Decryption error" in result.stderr, result.stderr
    packets = received_packets(result.stdout + result.stderr)
    assert packets, "the agent answered with Reports"
    assert all(b"edge-router" not in p for p in packets)


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
    assert lines("snmpset", *v3("shades"), agent, "1.3.6.1.2.1.4.1.0", "i", "2") == [
        ".1.3.6.1.2.1.4.1.0 = INTEGER: 2"]
    noauth = snmp("snmpset", *v3("noauth"), agent, "1.3.6.1.2.1.1.4.0", "s", "x", check=False)
    assert "authorizationError" in noauth.stderr + noauth.stdout, "noauth has no write view"


def test_pysnmp_reads_at_every_level(v3net):
    script = f"""
from pysnmp.hlapi import *
host, port = "{v3net.agent(0)}".split(":")
users = [UsmUserData("noauth"),
         UsmUserData("md5des", "md5password", "despassword", authProtocol=usmHMACMD5AuthProtocol,
                     privProtocol=usmDESPrivProtocol),
         UsmUserData("shaaes", "shapassword", "aespassword", authProtocol=usmHMACSHAAuthProtocol,
                     privProtocol=usmAesCfb128Protocol)]
for user in users:
    error, status, index, binds = next(getCmd(SnmpEngine(), user,
        UdpTransportTarget((host, int(port)), timeout=1, retries=1), ContextData(),
        ObjectType(ObjectIdentity("{SYS_NAME}"))))
    assert not error and not status, (user, error, status)
    print(binds[0][1].prettyPrint())
"""
    result = subprocess.run(["/usr/bin/python3", "-c", script], capture_output=True, text=True, timeout=60)
    assert result.returncode == 0, result.stderr
    assert result.stdout.split() == ["edge-router"] * 3


def test_engine_objects_tell_the_agents_identity_and_counters(v3net):
    agent = v3net.agent(0)
    engine, unknown_users = "1.3.6.1.6.3.10.2.1", "1.3.6.1.6.3.15.1.1.3.0"

    def read(*oids):
        return [l.split(" = ", 1)[1] for l in lines("snmpget", *v3("md5"), agent, *oids)]

    engine_id, boots, first_time, unknown_before = read(f"{engine}.1.0", f"{engine}.2.0", f"{engine}.3.0",
                                                        unknown_users)
    assert (engine_id, boots) == (f'STRING: "{agent.replace(":", "#")}"', "INTEGER: 1")
    assert read(f"{engine}.4.0") == ["INTEGER: 19989"]
    result = snmp("snmpget", *v3("nobody", "-l", "noAuthNoPriv"), agent, SYS_NAME, check=False)
    assert "Unknown user name" in result.stderr
    time.sleep(1.2)
    later_time, unknown_after = read(f"{engine}.3.0", unknown_users)
    assert int(later_time.split()[-1]) > int(first_time.split()[-1])
    assert int(unknown_after.split()[-1]) > int(unknown_before.split()[-1])
    refused = snmp("snmpset", *v3("shaaes"), agent, f"{engine}.2.0", "i", "7", check=False)
    assert "notWritable" in refused.stderr + refused.stdout
    walked = [l.split(" = ")[0] for l in lines("snmpwalk", *v3("md5"), agent, "1.3.6.1.6.3")
              if "No more variables left" not in l]
    assert walked == [f".{engine}.{i}.0" for i in (1, 2, 3, 4)] + [f".1.3.6.1.6.3.11.2.1.{i}.0" for i in (1, 2, 3)] + [
        f".1.3.6.1.6.3.15.1.1.{i}.0" for i in range(1, 7)]


def test_given_configuration_replaces_the_default_and_communities_keep_working(tmp_path):
    config = tmp_path / "v3.conf"
    config.write_text('user solo SHA_AUTH solopassword CFB_AES_128 solosecret\ncontext ""\n'
                      "group 3 solo g\naccess g \"\" 3 3 1 sys \"\" \"\"\nview sys 1.3.6.1.2.1.1 \"\" 1\n")
    net = Network(PROFILE, 1, "127.0.3.45", BASE_PORT + 5, extra=("--snmpv3", str(config)))
    try:
        agent = net.agent(0)
        solo = ("-l", "authPriv", "-a", "SHA", "-A", "solopassword", "-x", "AES", "-X", "solosecret")
        assert lines("snmpget", *v3("solo", *solo), agent, SYS_NAME) == [f'.{SYS_NAME} = STRING: "edge-router"']
        assert all(l.startswith(".1.3.6.1.2.1.1.") for l in walk("snmpwalk", agent, *v3("solo", *solo)))
        unknown = snmp("snmpget", *v3("shaaes"), agent, SYS_NAME, check=False)
        assert "Unknown user name" in unknown.stderr
        assert lines("snmpget", "-v2c", "-c", "public", *BOUNDED, agent, SYS_NAME) == [
            f'.{SYS_NAME} = STRING: "edge-router"']
    finally:
        assert net.stop() == 0


def test_faulty_configuration_stops_the_start(tmp_path):
    config = tmp_path / "bad.conf"
    config.write_text("user a MD5_AUTH md5password NO_PRIV -\nuser a SHA_AUTH shapassword NO_PRIV -\n")
    result = subprocess.run(launcher_command(PROFILE, 1, "127.0.3.46", BASE_PORT + 7, ("--snmpv3", str(config))),
                            cwd=tmp_path, capture_output=True, text=True, timeout=60)
    assert (result.returncode, result.stdout) == (2, "")
    assert result.stderr.strip() == f"{config}:2: user 'a' is already defined at line 1"
