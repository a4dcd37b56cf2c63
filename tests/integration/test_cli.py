"""CLI end to end: devices of a network file answer Telnet and SSH clients on loopback with the router
command line of profiles/router.cli, each device keeping its own running configuration, and the control
interface reads that configuration and restarts a device with its saved one."""

import ipaddress
import json
import socket
import threading
import time
import urllib.request

import paramiko
import pytest

from conftest import BASE_PORT, ROOT, FileNetwork

ADMIN_PORT, TELNET_PORT, SSH_PORT = BASE_PORT + 1, BASE_PORT + 2, BASE_PORT + 3
FIRST, DEVICES = "127.0.10.1", 50
IAC, DONT, DO, WONT, WILL, SB, SE, TTYPE = 255, 254, 253, 252, 251, 250, 240, 24


def device(i):
    return str(ipaddress.IPv4Address(FIRST) + i)


@pytest.fixture(scope="module")
def network():
    net = FileNetwork(f"""
        - name: edge
          count: {DEVICES + 1}
          address: {FIRST}
          device-name: "E{{n}}"
          cli: {{port: {TELNET_PORT}, ssh-port: {SSH_PORT}, data: {ROOT / 'profiles' / 'router.cli'},
                 user: admin, password: admin, enable: secret}}
        """, ADMIN_PORT)
    yield net
    assert net.stop() == 0


class Telnet:
    """A Telnet client of our own: it answers the server's option requests as a terminal would
    (`negotiate`) or refuses them all, and keeps what it received apart from the commands."""

    def __init__(self, address, negotiate):
        self.socket = socket.create_connection((address, TELNET_PORT), timeout=10)
        self.negotiate, self.text, self.raw = negotiate, b"", b""

    def until(self, marker, seconds=10):
        """The text received up to and including `marker`, taken off what is kept."""
        deadline = time.monotonic() + seconds
        while marker.encode() not in self.text:
            self.socket.settimeout(max(0.01, deadline - time.monotonic()))
            try:
                chunk = self.socket.recv(65536)
            except socket.timeout:
                chunk = None
            if not chunk:
                raise AssertionError(f"no {marker!r} in {self.text!r}" + ("" if chunk is None else " (closed)"))
            self._read(chunk)
        end = self.text.index(marker.encode()) + len(marker)
        taken, self.text = self.text[:end], self.text[end:]
        return taken.decode("latin-1")

    def _read(self, chunk):
        self.raw += chunk
        while self.raw:
            if self.raw[0] != IAC:
                plain = self.raw.split(bytes([IAC]))[0]
                self.text, self.raw = self.text + plain, self.raw[len(plain):]
            elif len(self.raw) >= 2 and self.raw[1] == SB:
                if bytes([IAC, SE]) not in self.raw:
                    return
                self.raw = self.raw[self.raw.index(bytes([IAC, SE])) + 2:]
                self.socket.sendall(bytes([IAC, SB, TTYPE, 0]) + b"XTERM" + bytes([IAC, SE]))
            elif len(self.raw) >= 3:
                verb, option = self.raw[1], self.raw[2]
                self.raw = self.raw[3:]
                if verb in (DO, WILL):
                    yes = self.negotiate
                    answer = (WILL if yes else WONT) if verb == DO else (DO if yes else DONT)
                    self.socket.sendall(bytes([IAC, answer, option]))
            else:
                return

    def line(self, text, prompt):
        """Types a line and answers what came up to the next `prompt`."""
        self.socket.sendall(text.encode() + b"\r\n")
        return self.until(prompt)

    def login(self, name, password="admin"):
        self.until("Username: ")
        self.line("admin", "Password: ")
        return self.line(password, f"{name}>")

    def close(self):
        self.socket.close()


def test_telnet_login_modes_errors_and_a_configuration_of_its_own(network):
    """On the device after the 50 the other tests use, as it renames itself."""
    client = Telnet(device(DEVICES), negotiate=True)
    try:
        greeting = client.until("Username: ", seconds=2)
        assert not any(line.rstrip().endswith((">", "#")) for line in greeting.splitlines()[:-1]), greeting
        assert client.line("admin", "Password: ").startswith("admin")
        assert "wrong" not in client.line("wrong", "Username: ")
        client.line("admin", "Password: ")
        assert client.line("admin", "E51>") == "\r\nE51>", "the password is not echoed"
        assert "Version" in client.line("sh ver", "E51>")
        assert "% Invalid input detected at '^' marker." in client.line("shaw version", "E51>")
        client.line("enable", "Password: ")
        assert client.line("secret", "E51#") == "******\r\nE51#"
        for command, prompt in [("conf t", "E51(config)#"), ("int gi0/2", "E51(config-if)#"),
                                ("description uplink to core", "E51(config-if)#"), ("no shut", "E51(config-if)#"),
                                ("exit", "E51(config)#"), ("hostname EDGE-51", "EDGE-51(config)#"), ("end", "EDGE-51#")]:
            assert client.line(command, prompt).startswith(command)
        config = client.line("show running-config", "EDGE-51#")
        assert "hostname EDGE-51\r\n" in config
        assert "interface GigabitEthernet0/2\r\n description uplink to core\r\n" in config
        brief = client.line("show ip interface brief", "EDGE-51#")
        assert any(row.startswith("GigabitEthernet0/2") and row.split()[-2:] == ["up", "up"]
                   for row in brief.splitlines()), brief
        assert "uplink to core" not in network.api(f"/api/devices/{device(0)}/cli/running-config")["runningConfig"]
    finally:
        client.close()


def test_ssh_gives_the_exec_prompt_at_once_and_serves_the_same_commands(network):
    ssh = paramiko.SSHClient()
    ssh.set_missing_host_key_policy(paramiko.AutoAddPolicy())
    ssh.connect(device(2), port=SSH_PORT, username="admin", password="admin", look_for_keys=False,
                allow_agent=False, timeout=10)
    try:
        shell = ssh.invoke_shell()
        shell.settimeout(10)
        seen = b""
        for command, prompt in [(None, b"E3>"), (b"show version\r", b"E3>"), (b"enable\r", b"Password: "),
                                (b"secret\r", b"E3#")]:
            if command:
                shell.send(command)
            seen = b""
            while prompt not in seen:
                seen += shell.recv(65536)
            if command == b"show version\r":
                assert seen.startswith(b"show version\r\n") and b"Version" in seen
        assert seen.endswith(b"E3#")
    finally:
        ssh.close()
    with pytest.raises(paramiko.AuthenticationException):
        ssh.connect(device(2), port=SSH_PORT, username="admin", password="nope", look_for_keys=False,
                    allow_agent=False, timeout=10)


def test_two_hundred_sessions_push_configurations_at_once(network):
    """Four sessions on each of the 50 devices configure one interface each and read it back."""
    failures = []

    def push(i):
        client = Telnet(device(i // 4), negotiate=False)
        name = f"E{i // 4 + 1}"
        try:
            client.login(name)
            client.line("enable", "Password: ")
            client.line("secret", f"{name}#")
            client.line("configure terminal", f"{name}(config)#")
            client.line(f"interface GigabitEthernet0/{i % 4 + 1}", f"{name}(config-if)#")
            client.line(f"description session {i}", f"{name}(config-if)#")
            client.line("end", f"{name}#")
            if f" description session {i}\r\n" not in client.line("show running-config", f"{name}#"):
                failures.append(i)
        except AssertionError as error:
            failures.append(f"{i}: {error}")
        finally:
            client.close()

    threads = [threading.Thread(target=push, args=(i,)) for i in range(4 * DEVICES)]
    for thread in threads:
        thread.start()
    for thread in threads:
        thread.join(60)
    assert not failures, failures[:5]
    for d in range(0, DEVICES, 7):
        config = network.api(f"/api/devices/{device(d)}/cli/running-config")["runningConfig"]
        assert all(f" description session {4 * d + k}\n" in config for k in range(4)), config


def test_a_restarted_device_comes_back_with_its_saved_configuration(network):
    address = device(9)
    client = Telnet(address, negotiate=True)
    try:
        client.login("E10")
        client.line("enable", "Password: ")
        client.line("secret", "E10#")
        client.line("conf t", "E10(config)#")
        client.line("snmp-server location saved rack", "E10(config)#")
        client.line("do write memory", "E10(config)#")
        client.line("snmp-server contact not saved", "E10(config)#")
    finally:
        client.close()
    request = urllib.request.Request(f"{network.admin}/api/devices/{address}/restart", method="POST")
    with urllib.request.urlopen(request, timeout=10) as answer:
        assert answer.status == 200, json.load(answer)
    config = network.api(f"/api/devices/{address}/cli/running-config")["runningConfig"]
    assert "snmp-server location saved rack" in config and "not saved" not in config, config
    again = Telnet(address, negotiate=False)
    try:
        assert again.login("E10").endswith("E10>")
    finally:
        again.close()
