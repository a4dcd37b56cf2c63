"""TL1 end to end: devices of a network file answer raw TCP and Telnet clients on loopback from their
data files, and the control interface sends their autonomous messages, runs their waiting commands and
stops and starts their listeners."""

import json
import re
import socket
import time
import urllib.error
import urllib.request

import pytest

from conftest import BASE_PORT, ROOT, FileNetwork, snmp

ADMIN_PORT, RAW_PORT, TELNET_PORT, SNMP_PORT = BASE_PORT + 1, BASE_PORT + 3, BASE_PORT + 4, BASE_PORT + 5
NE1, NE2, SEC1 = "127.0.8.1", "127.0.8.2", "127.0.8.11"
PROMPT = "\r\nTL1>>"
HEADER = r"\r\n\n   {sid} \d\d-\d\d-\d\d \d\d:\d\d:\d\d\r\nM  {ctag} {word}"
IAC, WILL, DO, ECHO, SGA = 255, 251, 253, 1, 3
SECURE_DATA = """\
[RTRV-TAG]
COMPLD
"{SID}:{CTAG}"
/* for {CTAG} */
"""


@pytest.fixture(scope="module")
def network(tmp_path_factory):
    data = tmp_path_factory.mktemp("tl1") / "secure.tl1"
    data.write_text(SECURE_DATA)
    net = FileNetwork(f"""
        - name: optical
          count: 2
          address: {NE1}
          device-name: "NE{{n}}"
          tl1: {{port: {RAW_PORT}, telnet-port: {TELNET_PORT}, data: {ROOT / 'profiles' / 'optical.tl1'},
                 users: [{{user: admin, password: admin}}]}}
        - name: secure
          count: 1
          address: {SEC1}
          device-name: "SEC{{n}}"
          snmp: {{port: {SNMP_PORT}, data: {ROOT / 'profiles' / 'router.snmprec'}}}
          tl1: {{port: {RAW_PORT}, data: {data}, keepalive: 2, require-login: true,
                 users: [{{user: admin, password: admin}}]}}
        """, ADMIN_PORT)
    yield net
    assert net.stop() == 0


class Client:
    """One TCP session with a device; everything it received is kept in `seen`."""

    def __init__(self, address, port=RAW_PORT):
        self.socket = socket.create_connection((address, port), timeout=5)
        self.buffer = b""

    def send(self, text):
        self.socket.sendall(text.encode() if isinstance(text, str) else text)

    def until(self, marker, seconds=5):
        """What arrived up to and including the first `marker`, taken off the buffer."""
        marker = marker.encode() if isinstance(marker, str) else marker
        deadline = time.monotonic() + seconds
        while marker not in self.buffer:
            self.socket.settimeout(max(0.01, deadline - time.monotonic()))
            try:
                chunk = self.socket.recv(65536)
            except socket.timeout:
                chunk = None
            if not chunk:
                raise AssertionError(f"no {marker!r} in {self.buffer!r}" + ("" if chunk is None else " (closed)"))
            self.buffer += chunk
        end = self.buffer.index(marker) + len(marker)
        taken, self.buffer = self.buffer[:end], self.buffer[end:]
        return taken.decode("latin-1")

    def answer(self, command):
        self.send(command)
        return self.until(PROMPT)

    def silent(self, seconds):
        """True when nothing arrives (and the session stays open) for `seconds`."""
        self.socket.settimeout(seconds)
        try:
            self.buffer += self.socket.recv(65536) or b"<closed>"
        except socket.timeout:
            return self.buffer == b""
        return False

    def closed_within(self, seconds):
        deadline = time.monotonic() + seconds
        while time.monotonic() < deadline:
            self.socket.settimeout(max(0.01, deadline - time.monotonic()))
            try:
                if not self.socket.recv(65536):
                    return True
            except socket.timeout:
                return False
            except ConnectionResetError:
                return True
        return False

    def close(self):
        self.socket.close()


def call(network, method, path, body=None):
    """The control interface's status and JSON answer."""
    data = None if body is None else json.dumps(body).encode()
    request = urllib.request.Request(network.admin + path, data=data, method=method)
    if data is not None:
        request.add_header("Content-Type", "application/json")
    try:
        with urllib.request.urlopen(request, timeout=10) as answer:
            return answer.status, json.load(answer)
    except urllib.error.HTTPError as error:
        return error.code, json.load(error)


def test_the_network_lists_tl1_devices_and_a_device_serves_both_protocols(network):
    assert network.summary == "3 devices running: optical 2/2, secure 1/1"
    groups = network.api("/api/network")["groups"]
    assert groups[0]["protocols"] == {"tl1": {"port": RAW_PORT, "telnetPort": TELNET_PORT}}
    assert groups[1]["protocols"] == {"snmp": {"port": SNMP_PORT}, "tl1": {"port": RAW_PORT}}
    assert network.api(f"/api/devices/{SEC1}")["protocols"] == {"snmp": "running", "tl1": "running"}
    assert snmp("snmpget", "-v2c", "-c", "public", "-t", "2", "-r", "1", "-Ovq", f"{SEC1}:{SNMP_PORT}",
                "1.3.6.1.2.1.1.5.0").stdout.strip()


def test_raw_sessions_answer_each_command_once_from_the_data_file(network):
    client = Client(NE1)
    try:
        answer = client.answer("RTRV-HDR:NE1::101;")
        assert re.fullmatch(HEADER.format(sid="NE1", ctag="101", word="COMPLD") + r"\r\n;" + re.escape(PROMPT), answer)
        # A command in two segments is one command; two in one segment are two answers, in order.
        client.send("RTRV-HD")
        time.sleep(0.3)
        client.send("R:NE1::102;RTRV-EQPT:NE1:SLOT-16:103;")
        assert "M  102 COMPLD" in client.until(PROMPT)
        denied = client.until(PROMPT)
        assert re.search(HEADER.format(sid="NE1", ctag="103", word="DENY")
                         + r'\r\n   IENE\r\n   "SPECIFIED OBJECT ENTITY DOES NOT EXIST"\r\n;', denied), denied
        assert client.silent(0.5), "one answer per command"
        assert re.search(r"M  104 DENY\r\n   SCNF\r\n", client.answer("RTRV-BOGUS:NE1::104;"))
    finally:
        client.close()


def test_login_placeholders_and_keepalive_of_a_group_that_asks_for_them(network):
    secure, quiet = Client(SEC1), Client(NE2)
    try:
        assert re.search(r"M  301 DENY\r\n   PLNA", secure.answer("RTRV-TAG:SEC1::301;"))
        assert re.search(r"M  302 DENY\r\n   PIUI", secure.answer("ACT-USER:SEC1:admin:302::wrong;"))
        assert "M  303 COMPLD" in secure.answer("ACT-USER:SEC1:admin:303::admin;")
        assert re.search(r'M  304 COMPLD\r\n   "SEC1:304"\r\n   /\* for 304 \*/\r\n;',
                         secure.answer("RTRV-TAG:SEC1::304;"))
        # This group's sessions close after 2 silent seconds; the optical group's (keepalive 0) stay.
        assert secure.closed_within(6), "a silent session outlives its keep-alive"
        assert "M  305 COMPLD" in quiet.answer("RTRV-HDR:NE2::305;"), "keep-alive 0 closed a session"
    finally:
        secure.close()
        quiet.close()


def test_telnet_sessions_negotiate_echo_and_answer_what_is_typed(network):
    client = Client(NE1, TELNET_PORT)
    try:
        offered = client.until(bytes([IAC, WILL, SGA]))
        assert bytes([IAC, WILL, ECHO]).decode("latin-1") in offered, "the server offers to echo"
        client.send(bytes([IAC, DO, ECHO, IAC, DO, SGA]))
        for character in "RTRV-HDR:NE1::201;":
            client.send(character)
            time.sleep(0.01)
        client.send("\r\n")
        typed = client.until("M  201 COMPLD")
        assert "RTRV-HDR:NE1::201;" in typed, "the server echoes what is typed"
        assert client.until(PROMPT).endswith("\r\n;" + PROMPT)
    finally:
        client.close()


def test_autonomous_messages_reach_every_client_with_consecutive_atags(network):
    message = {"severity": "critical", "verb": "REPT", "modifiers": ["ALM", "EQPT"],
               "lines": [{"type": "quoted", "text": "SLOT-5:CR,LOS,SA"}]}
    deadline = time.monotonic() + 3  # the sessions of earlier tests may take a moment to close
    while (answer := call(network, "POST", f"/api/devices/{NE2}/tl1/messages", message))[0] != 409:
        assert time.monotonic() < deadline, answer
        time.sleep(0.1)
    assert "no client connected" in answer[1]["error"]
    first, second = Client(NE2), Client(NE2)
    try:
        first.answer("RTRV-HDR:NE2::1;")  # both sessions are open and idle before the message
        second.answer("RTRV-HDR:NE2::2;")
        assert call(network, "POST", f"/api/devices/{NE2}/tl1/atag", {"atag": 100}) == (200, {"atag": 100})
        assert call(network, "POST", f"/api/devices/{NE2}/tl1/messages", message) == (200, {"clients": 2})
        atags = []
        for client in (first, second):
            sent = client.until(PROMPT)
            found = re.search(r'\r\n\*C (\d+) REPT ALM EQPT\r\n   "SLOT-5:CR,LOS,SA"\r\n;', sent)
            assert found, sent
            atags.append(int(found.group(1)))
        assert sorted(atags) == [100, 101]
    finally:
        first.close()
        second.close()


def test_a_delayed_command_waits_until_run_through_the_control_interface(network):
    client = Client(NE1)
    try:
        assert "M  401 DELAY" in client.answer("ED-EQPT:NE1:SLOT-5:401:ON=5;")
        assert "SAAS" in client.answer("ED-EQPT:NE1:SLOT-5:402:ON=5;"), "a second ON=5 of the session is refused"
        status, listed = call(network, "GET", f"/api/devices/{NE1}/tl1/pending")
        assert status == 200 and len(listed["pending"]) == 1, listed
        entry = listed["pending"][0]
        assert (entry["on"], entry["date"], entry["time"], entry["command"].rstrip(";")) == (
            5, None, None, "ED-EQPT:NE1:SLOT-5:401:ON=5")
        assert client.silent(0.5), "a command with ON alone runs only when asked"
        assert call(network, "POST", f"/api/devices/{NE1}/tl1/pending/{entry['id']}/run")[0] == 200
        assert "M  401 COMPLD" in client.until(PROMPT)
        assert call(network, "GET", f"/api/devices/{NE1}/tl1/pending") == (200, {"pending": []})
        assert call(network, "POST", f"/api/devices/{NE1}/tl1/pending/{entry['id']}/run")[0] == 404
    finally:
        client.close()


def test_stopping_the_tl1_protocol_closes_the_port_and_starting_opens_it(network):
    client = Client(NE2)
    try:
        stopped = call(network, "POST", f"/api/devices/{NE2}/stop", {"protocol": "tl1"})
        assert stopped[0] == 200 and stopped[1]["protocols"] == {"tl1": "stopped"}
        assert client.closed_within(3), "the device's sessions close with it"
        with pytest.raises(ConnectionRefusedError):
            Client(NE2)
        started = call(network, "POST", f"/api/devices/{NE2}/start", {"protocol": "tl1"})
        assert started[0] == 200 and started[1]["protocols"] == {"tl1": "running"}
        again = Client(NE2, TELNET_PORT)
        again.close()
        reopened = Client(NE2)
        assert "M  501 COMPLD" in reopened.answer("RTRV-HDR:NE2::501;")
        reopened.close()
    finally:
        client.close()
