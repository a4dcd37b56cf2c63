"""Managers talk to Tessel's devices exactly as to snmpsim serving the same recorded data."""

from conftest import BASE_PORT, Network, lines, snmp, walk

PUBLIC, PRIVATE = ("-v2c", "-c", "public"), ("-v2c", "-c", "private")
CONTACT = ("1.3.6.1.2.1.1.4.0",)


def test_walks_match_snmpsim(network, simulator):
    expected = walk("snmpwalk", simulator.endpoint, *PUBLIC)
    assert len(expected) > 300
    for device in range(network.devices):
        assert walk("snmpwalk", network.agent(device), *PUBLIC) == expected
    assert walk("snmpwalk", network.agent(0), "-v1", "-c", "public") == [l for l in expected if "Counter64" not in l]


def test_get_getnext_and_errors(network):
    agent = network.agent(2)
    got = lines("snmpget", *PUBLIC, agent, "1.3.6.1.2.1.1.5.0", "1.3.6.1.2.1.2.2.1.2.2",
                "1.3.6.1.2.1.1.99.0", "1.3.6.1.2.1.2.2.1.2.99")
    assert got == ['.1.3.6.1.2.1.1.5.0 = STRING: "edge-router"',
                   '.1.3.6.1.2.1.2.2.1.2.2 = STRING: "GigabitEthernet0/0"',
                   ".1.3.6.1.2.1.1.99.0 = No Such Object available on this agent at this OID",
                   ".1.3.6.1.2.1.2.2.1.2.99 = No Such Instance currently exists at this OID"]
    assert lines("snmpgetnext", *PRIVATE, agent, "1.3.6.1.2.1.2.2.1.2.5") == [".1.3.6.1.2.1.2.2.1.3.1 = INTEGER: 24"]
    v1 = snmp("snmpget", "-v1", "-c", "public", agent, "1.3.6.1.2.1.1.99.0", check=False)
    assert "noSuchName" in v1.stderr + v1.stdout
    wrong = snmp("snmpget", "-v2c", "-c", "nobody", "-t", "0.5", "-r", "0", agent, *CONTACT, check=False)
    assert wrong.returncode != 0 and "Timeout" in wrong.stderr


def test_set_changes_one_device_only_and_a_refused_set_changes_nothing(network):
    first, second = network.agent(0), network.agent(1)
    snmp("snmpset", *PRIVATE, first, *CONTACT, "s", "ops team")
    refused = snmp("snmpset", *PUBLIC, "-t", "0.5", "-r", "0", first, *CONTACT, "s", "x", check=False)
    assert refused.returncode != 0, "a read community cannot set"
    refused = snmp("snmpset", "-On", *PRIVATE, first, *CONTACT, "s", "x", "1.3.6.1.2.1.1.6.0", "i", "5", check=False)
    assert "wrongType" in refused.stderr and "Failed object: .1.3.6.1.2.1.1.6.0" in refused.stderr
    assert lines("snmpget", *PUBLIC, first, *CONTACT) == ['.1.3.6.1.2.1.1.4.0 = STRING: "ops team"']
    assert lines("snmpget", *PUBLIC, second, *CONTACT) == ['.1.3.6.1.2.1.1.4.0 = STRING: "noc@example.net"']


def test_recorded_walk_and_given_v3_configuration_serve_a_network(tmp_path, simulator):
    """snmpwalk's own output serves as device data, and a given SNMPv3 configuration replaces the
    default one while communities keep working."""
    recorded, config = tmp_path / "recorded.walk", tmp_path / "v3.conf"
    recorded.write_text(snmp("snmpwalk", *PUBLIC, "-On", simulator.endpoint, "1.3").stdout)
    config.write_text('user solo SHA_AUTH solopassword CFB_AES_128 solosecret\ncontext ""\n'
                      'group 3 solo g\naccess g "" 3 3 1 sys "" ""\nview sys 1.3.6.1.2.1.1 "" 1\n')
    net = Network(recorded, 1, "127.0.3.20", BASE_PORT + 2, extra=("--snmpv3", str(config)))
    try:
        agent = net.agent(0)
        community = walk("snmpwalk", agent, *PUBLIC)
        assert community == walk("snmpwalk", simulator.endpoint, *PUBLIC)
        solo = ("-v3", "-t", "1", "-r", "1", "-l", "authPriv", "-a", "SHA", "-A", "solopassword", "-x", "AES",
                "-X", "solosecret")
        assert walk("snmpwalk", agent, *solo, "-u", "solo") == [l for l in community if l.startswith(".1.3.6.1.2.1.1.")]
        unknown = snmp("snmpget", *solo, "-u", "shaaes", agent, "1.3.6.1.2.1.1.5.0", check=False)
        assert "Unknown user name" in unknown.stderr
    finally:
        assert net.stop() == 0
