"""Notifications from a device, driven through the engine's exports by a small Java entry point
(NotifyProbe) and through a running network's control interface with ./tessel ctl, received by
net-snmp's snmptrapd started here on a loopback port with its own configuration."""

import os
import socket
import subprocess
import tempfile
import time
from pathlib import Path

import pytest

from conftest import BASE_PORT, BUILD, JAVA, PROFILE, ROOT, FileNetwork, snmp

DEVICE = "127.0.3.60"
DEVICE_PORT = BASE_PORT + 5
TRAPD_PORT = BASE_PORT + 7
SILENT_PORT = BASE_PORT + 8
NETWORK_DEVICE, NETWORK_PORT, ADMIN_PORT = "127.0.3.70", BASE_PORT + 2, BASE_PORT + 9
FIELDS = "%b|%a|%N|%w|%q|%P|%v\n"


def probe(manager_port, kind, trap, *bindings, community="public"):
    """Runs NotifyProbe, with the default SNMPv3 users; what it reports (the engine's status lines
    left out)."""
    jars = sorted(BUILD.glob("host/tessel-host*.jar"))
    assert len(jars) == 2, f"host jars not found under {BUILD}/host"
    command = [str(JAVA), f"-Dtessel.library={BUILD / 'src' / 'libtessel.so'}",
               f"-Dtessel.snmpv3={ROOT / 'profiles' / 'snmpv3.conf'}",
               "-cp", ":".join(str(j) for j in jars) + ":/usr/share/java/gson.jar",
               "com.kestrelon.simulator.tessel.snmp.NotifyProbe", DEVICE, str(DEVICE_PORT), "127.0.0.1",
               str(manager_port), kind, community, trap, *bindings]
    result = subprocess.run(command, capture_output=True, text=True, timeout=60)
    assert result.returncode == 0, result.stderr
    return [line[len("probe: "):] for line in result.stdout.splitlines() if line.startswith("probe: ")]


@pytest.fixture(scope="module")
def trapd():
    """snmptrapd logging every notification with community public, one line each."""
    workdir = tempfile.mkdtemp(prefix="tessel-trapd-")
    config, log = Path(workdir) / "snmptrapd.conf", Path(workdir) / "traps.log"
    engine_id = f"{DEVICE}#{DEVICE_PORT}".encode().hex()
    config.write_text("authCommunity log public\n"
                      f"createUser -e 0x{engine_id} shaaes SHA shapassword AES aespassword\n"
                      f"createUser -e 0x{engine_id} restricted SHA restrictedpw\n"
                      # informs: snmptrapd is their authoritative engine
                      "createUser shaaes SHA shapassword AES aespassword\n"
                      "authUser log shaaes\nauthUser log restricted auth\n")
    process = subprocess.Popen(
        ["snmptrapd", "-f", "-C", "-c", str(config), "-M", "/dev/null", "-m", "", "-n", "-On",
         "-Lf", str(log), "-F", FIELDS, f"udp:127.0.0.1:{TRAPD_PORT}"],
        stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
    deadline = time.monotonic() + 10
    while time.monotonic() < deadline and not (log.exists() and "NET-SNMP" in log.read_text()):
        time.sleep(0.1)

    def received(count, wait=10):
        """The notification lines logged so far, once there are count of them."""
        deadline = time.monotonic() + wait
        while True:
            rows = [line.split("|") for line in log.read_text().splitlines() if line.startswith("UDP:")]
            if len(rows) >= count or time.monotonic() > deadline:
                return rows
            time.sleep(0.1)

    yield received
    process.terminate()
    process.wait(timeout=15)
    subprocess.run(["rm", "-rf", workdir], check=False)


def source(row):
    """"UDP: [a]:p->[b]:q" -> "a:p" """
    return row[0].split("->")[0].replace("UDP: [", "").replace("]", "")


def test_traps_and_informs_arrive_from_the_device_with_their_fields(trapd):
    assert probe(TRAPD_PORT, "v1trap", "1.3.6.1.4.1.99/6/7", "1.3.6.1.2.1.2.2.1.1.2", "2", "2") == ["sent"]
    assert probe(TRAPD_PORT, "v2trap", "1.3.6.1.4.1.99.0.7", "1.3.6.1.2.1.1.5.0", "4", "core-7") == ["sent"]
    assert probe(TRAPD_PORT, "v2inform", "1.3.6.1.6.3.1.1.5.3", "1.3.6.1.2.1.2.2.1.1.2", "2", "2") == \
        ["sent", f"answered {DEVICE} 127.0.0.1:{TRAPD_PORT}"]
    v1, v2, inform = trapd(3)
    for row in (v1, v2, inform):
        assert source(row) == f"{DEVICE}:{DEVICE_PORT}"
    assert v1[1:6] == [DEVICE, ".1.3.6.1.4.1.99", "6", ".7", "TRAP, SNMP v1, community public"]
    assert v1[6] == ".1.3.6.1.2.1.2.2.1.1.2 = INTEGER: 2"
    assert v2[5] == "TRAP2, SNMP v2c, community public"
    bindings = v2[6].split("\t")
    assert bindings[0].startswith(".1.3.6.1.2.1.1.3.0 = Timeticks:")
    assert bindings[1:] == [".1.3.6.1.6.3.1.1.4.1.0 = OID: .1.3.6.1.4.1.99.0.7",
                            '.1.3.6.1.2.1.1.5.0 = STRING: "core-7"']
    assert inform[5] == "INFORM, SNMP v2c, community public"
    assert inform[6].split("\t")[1:] == [".1.3.6.1.6.3.1.1.4.1.0 = OID: .1.3.6.1.6.3.1.1.5.3",
                                         ".1.3.6.1.2.1.2.2.1.1.2 = INTEGER: 2"]


@pytest.fixture
def silent():
    """A manager's port that receives and never answers: the senders of what it received."""
    sock = socket.socket(socket.AF_INET, socket.SOCK_DGRAM)
    sock.bind(("127.0.0.1", SILENT_PORT))

    def senders():
        sock.settimeout(0.5)
        found = []
        try:
            while len(found) < 5:
                found.append(sock.recvfrom(2048)[1])
        except socket.timeout:
            pass
        return found

    yield senders
    sock.close()


def test_inform_nobody_answers_is_sent_once_then_reported_dropped(silent):
    start = time.monotonic()
    assert probe(SILENT_PORT, "v2inform", "1.3.6.1.4.1.99.0.1") == ["sent", f"dropped 127.0.0.1:{SILENT_PORT}"]
    assert time.monotonic() - start >= 5, "an inform waits 5 s for its Response"
    assert silent() == [(DEVICE, DEVICE_PORT)], "1 + 0 retries, from the device"


def test_v3_notifications_arrive_authenticated_and_encrypted_and_only_within_the_notify_view(trapd):
    before = len(trapd(0, wait=0))
    assert probe(TRAPD_PORT, "v3trap", "1.3.6.1.4.1.99.0.7", "1.3.6.1.2.1.2.2.1.1.2", "2", "2",
                 community="shaaes") == ["sent"]
    # restricted's notify view leaves out the interfaces group: this one is not sent ...
    assert probe(TRAPD_PORT, "v3trap", "1.3.6.1.4.1.99.0.8", "1.3.6.1.2.1.2.2.1.1.2", "2", "2",
                 community="restricted") == ["sent"]
    # ... and this one is.
    assert probe(TRAPD_PORT, "v3trap", "1.3.6.1.4.1.99.0.9", "1.3.6.1.2.1.1.5.0", "4", "core-7",
                 community="restricted") == ["sent"]
    # An inform first discovers snmptrapd's engine, then is answered.
    assert probe(TRAPD_PORT, "v3inform", "1.3.6.1.4.1.99.0.7", "1.3.6.1.2.1.1.5.0", "4", "core-7",
                 community="shaaes") == ["sent", f"answered {DEVICE} 127.0.0.1:{TRAPD_PORT}"]
    rows = trapd(before + 3)[before:]
    time.sleep(0.5)
    assert len(trapd(0, wait=0)) == before + 3, "the trap outside the notify view is not sent"
    private, authenticated, inform = rows
    for row in rows:
        assert source(row) == f"{DEVICE}:{DEVICE_PORT}"
    assert private[5].startswith("TRAP2, SNMP v3, user shaaes, context")
    assert private[6].split("\t")[1:] == [".1.3.6.1.6.3.1.1.4.1.0 = OID: .1.3.6.1.4.1.99.0.7",
                                          ".1.3.6.1.2.1.2.2.1.1.2 = INTEGER: 2"]
    assert authenticated[5].startswith("TRAP2, SNMP v3, user restricted, context")
    assert authenticated[6].split("\t")[1] == ".1.3.6.1.6.3.1.1.4.1.0 = OID: .1.3.6.1.4.1.99.0.9"
    assert inform[5].startswith("INFORM, SNMP v3, user shaaes, context")
    assert inform[6].split("\t")[1:] == [".1.3.6.1.6.3.1.1.4.1.0 = OID: .1.3.6.1.4.1.99.0.7",
                                         '.1.3.6.1.2.1.1.5.0 = STRING: "core-7"']


@pytest.fixture(scope="module")
def network():
    """One device with its control interface, for ./tessel ctl."""
    net = FileNetwork(f"""
        - name: notifiers
          count: 1
          address: {NETWORK_DEVICE}
          snmp: {{port: {NETWORK_PORT}, data: {PROFILE}, v3: {ROOT / "profiles" / "snmpv3.conf"}}}
        """, ADMIN_PORT)
    yield net
    assert net.stop() == 0


def ctl(network, *args):
    result = subprocess.run([str(ROOT / "tessel"), "ctl", "--admin", network.admin, *args],
                            capture_output=True, text=True, timeout=120)
    return result.returncode, result.stdout, result.stderr


def test_ctl_trap_and_inform_arrive_from_the_device_with_the_trap_oid_and_binding(network, trapd):
    before = len(trapd(0, wait=0))
    to = f"127.0.0.1:{TRAPD_PORT}"
    assert ctl(network, "trap", NETWORK_DEVICE, "--to", to, "1.3.6.1.6.3.1.1.5.3",
               "1.3.6.1.2.1.2.2.1.1.2", "i", "-2") == (0, "sent\n", "")
    assert ctl(network, "inform", NETWORK_DEVICE, "--to", to, "--wait", "1.3.6.1.4.1.99.0.4",
               "1.3.6.1.2.1.1.5.0", "s", "core 7") == (0, "acknowledged\n", "")
    assert ctl(network, "inform", NETWORK_DEVICE, "--to", to, "--version", "v3", "--user", "shaaes", "--wait",
               "1.3.6.1.4.1.99.0.6") == (0, "acknowledged\n", "")
    assert ctl(network, "trap", NETWORK_DEVICE, "--to", to, "--version", "v1", "--enterprise", "1.3.6.1.4.1.99",
               "--generic", "6", "--specific", "7") == (0, "sent\n", "")
    trap, inform, v3_inform, v1_trap = trapd(before + 4)[before:]
    assert v3_inform[5].startswith("INFORM, SNMP v3, user shaaes")
    assert v1_trap[1:6] == [NETWORK_DEVICE, ".1.3.6.1.4.1.99", "6", ".7", "TRAP, SNMP v1, community public"]
    for row in (trap, inform, v3_inform, v1_trap):
        assert source(row) == f"{NETWORK_DEVICE}:{NETWORK_PORT}"
    assert trap[5] == "TRAP2, SNMP v2c, community public"
    assert trap[6].split("\t")[1:] == [".1.3.6.1.6.3.1.1.4.1.0 = OID: .1.3.6.1.6.3.1.1.5.3",
                                       ".1.3.6.1.2.1.2.2.1.1.2 = INTEGER: -2"]
    assert inform[5] == "INFORM, SNMP v2c, community public"
    assert inform[6].split("\t")[1:] == [".1.3.6.1.6.3.1.1.4.1.0 = OID: .1.3.6.1.4.1.99.0.4",
                                        '.1.3.6.1.2.1.1.5.0 = STRING: "core 7"']
    # The control interface refuses what it cannot send, and sends nothing.
    status, _, error = ctl(network, "trap", NETWORK_DEVICE, "--to", to, "1.3.6.1.4.1.99.0.5",
                           "1.3.6.1.2.1.1.5.0", "q", "x")
    assert status == 1 and "unknown type 'q'" in error, error
    # restricted's notify view leaves out the interfaces group.
    status, _, error = ctl(network, "trap", NETWORK_DEVICE, "--to", to, "--version", "v3", "--user", "restricted",
                           "1.3.6.1.4.1.99.0.8", "1.3.6.1.2.1.2.2.1.1.2", "i", "2")
    assert status == 1 and "notify view" in error, error
    time.sleep(0.5)
    assert len(trapd(0, wait=0)) == before + 4


def test_ctl_inform_nobody_answers_ends_dropped_after_each_send(network, silent):
    start = time.monotonic()
    assert ctl(network, "inform", NETWORK_DEVICE, "--to", f"127.0.0.1:{SILENT_PORT}", "--timeout", "1",
               "--retries", "1", "--wait", "1.3.6.1.4.1.99.0.1") == (1, "dropped\n", "")
    assert time.monotonic() - start >= 2, "two sends a timeout apart"
    assert silent() == [(NETWORK_DEVICE, NETWORK_PORT)] * 2
    informs = network.api("/api/informs")["informs"]
    assert informs[-1] == {"id": informs[-1]["id"], "state": "dropped", "sends": 2, "device": NETWORK_DEVICE,
                           "manager": f"127.0.0.1:{SILENT_PORT}"}


SINKED = ["127.0.3.80", "127.0.3.81"]


def test_standard_traps_reach_the_network_and_group_sinks_each_in_its_version(trapd):
    """A v1 sink for the whole network and a v2c sink of the group: each device's coldStart, an
    authenticationFailure for a wrong community, and a coldStart again after a restart."""
    before = len(trapd(0, wait=0))
    net = FileNetwork(f"""
        - name: sinked
          count: 2
          address: {SINKED[0]}
          snmp: {{port: {NETWORK_PORT}, data: {PROFILE}}}
          trap-sinks: [{{version: v2c, address: 127.0.0.1, port: {TRAPD_PORT}}}]
        """, BASE_PORT + 7, top=f"trap-sinks: [{{version: v1, address: localhost, port: {TRAPD_PORT}}}]")

    def arrived(count, since):
        """Rows since..count of this test, in order of source and version."""
        rows = trapd(before + count)[before:]
        assert len(rows) == count, rows
        return sorted(rows[since:], key=lambda row: (source(row), row[5]))

    def expect(rows, devices, generic):
        """Per device a v1 Trap and an SNMPv2-Trap of the standard trap generic, from the device."""
        assert len(rows) == 2 * len(devices)
        for device, (v1, v2) in zip(devices, zip(rows[0::2], rows[1::2])):
            assert source(v1) == source(v2) == f"{device}:{NETWORK_PORT}"
            assert v1[1:6] == [device, ".1.3.6.1.6.3.1.1.5", str(generic), "0", "TRAP, SNMP v1, community public"]
            assert v2[5] == "TRAP2, SNMP v2c, community public"
            assert v2[6].split("\t")[1] == f".1.3.6.1.6.3.1.1.4.1.0 = OID: .1.3.6.1.6.3.1.1.5.{generic + 1}"

    try:
        expect(arrived(4, 0), SINKED, 0)
        snmp("snmpget", "-v2c", "-c", "guess", "-t", "1", "-r", "0", f"{SINKED[1]}:{NETWORK_PORT}",
             "1.3.6.1.2.1.1.5.0", check=False)
        expect(arrived(6, 4), SINKED[1:], 4)
        status = subprocess.run([str(ROOT / "tessel"), "ctl", "--admin", net.admin, "restart", SINKED[0]],
                                capture_output=True, text=True, timeout=120)
        assert status.returncode == 0, status.stderr
        expect(arrived(8, 6), SINKED[:1], 0)
        time.sleep(0.5)
        assert len(trapd(0, wait=0)) == before + 8, "one of each, no more"
    finally:
        assert net.stop() == 0


SCHEDULED = ["127.0.3.90", "127.0.3.91"]


def test_scheduled_traps_leave_each_device_in_turn_until_it_stops(trapd):
    """A group of two sends a trap every second, the second device half a period after the first;
    a device stopped through ./tessel ctl sends no more while the other goes on."""
    net = FileNetwork(f"""
        - name: timed
          count: 2
          address: {SCHEDULED[0]}
          snmp: {{port: {NETWORK_PORT}, data: {PROFILE}}}
          notifications:
            - {{every: 1s, to: '127.0.0.1:{TRAPD_PORT}', oid: 1.3.6.1.4.1.99.0.21,
               varbinds: [{{oid: 1.3.6.1.2.1.1.5.0, type: s, value: timed}}]}}
        """, BASE_PORT + 7)

    def timed():
        """The scheduled traps logged so far."""
        return [row for row in trapd(0, wait=0)
                if source(row).split(":")[0] in SCHEDULED and "OID: .1.3.6.1.4.1.99.0.21" in row[6]]

    def sent():
        """Per device, how many scheduled traps were logged so far."""
        rows = timed()
        return {device: sum(source(row) == f"{device}:{NETWORK_PORT}" for row in rows) for device in SCHEDULED}

    try:
        # Turns are timed from traps that arrive while watching: earlier ones may have come at any time.
        start, first_seen, deadline = sent(), {}, time.monotonic() + 5
        while len(first_seen) < 2 and time.monotonic() < deadline:
            counts = sent()
            for device in SCHEDULED:
                if counts[device] > start[device] and device not in first_seen:
                    first_seen[device] = time.monotonic()
            time.sleep(0.05)
        assert len(first_seen) == 2, sent()
        spread = first_seen[SCHEDULED[1]] - first_seen[SCHEDULED[0]]
        assert 0.2 <= spread % 1.0 <= 0.8, f"the second device's turn came {spread:.2f} s after the first's"
        row = timed()[0]
        assert row[5] == "TRAP2, SNMP v2c, community public" and 'STRING: "timed"' in row[6]

        stop = subprocess.run([str(ROOT / "tessel"), "ctl", "--admin", net.admin, "stop", SCHEDULED[1]],
                              capture_output=True, text=True, timeout=120)
        assert stop.returncode == 0, stop.stderr
        time.sleep(0.2)
        before = sent()
        time.sleep(2.5)
        after = sent()
        assert after[SCHEDULED[1]] == before[SCHEDULED[1]], "a stopped device sent"
        assert after[SCHEDULED[0]] - before[SCHEDULED[0]] >= 2
    finally:
        assert net.stop() == 0
