"""The control interface end to end: `./tessel ctl` and the dashboard in a real browser drive a network
started from a network file, and SNMP managers see what they did."""

import base64
import fcntl
import json
import os
import re
import select
import shutil
import socket
import subprocess
import time
import urllib.request

import pytest

from conftest import BASE_PORT, BUILD, PROFILE, ROOT, FileNetwork, snmp

ROUTER_PORT, HOST_PORT, ADMIN_PORT = BASE_PORT + 4, BASE_PORT + 6, BASE_PORT + 8
HOST_DATA = ROOT / "host" / "src" / "test" / "resources" / "data" / "linux-host.walk"
SYS_DESCR = "1.3.6.1.2.1.1.1.0"
SCREENSHOT = BUILD / "tests" / "integration" / "dashboard.png"
TOKEN = "integration-token-0123456789"


@pytest.fixture(scope="module")
def network():
    net = FileNetwork(f"""
        - name: routers
          count: 3
          address: 127.0.6.1
          device-name: "R{{n}}"
          snmp: {{port: {ROUTER_PORT}, data: {PROFILE}}}
        - name: hosts
          count: 2
          address: 127.0.7.1
          device-name: "host-{{n}}"
          snmp: {{port: {HOST_PORT}, data: {HOST_DATA}}}
        """, ADMIN_PORT, TOKEN)
    yield net
    assert net.stop() == 0


def ctl(*args):
    return subprocess.run([str(ROOT / "tessel"), "ctl", *args], capture_output=True, text=True, timeout=120)


def sys_descr(endpoint):
    """The device's sysDescr, or None when it does not answer within a second."""
    got = snmp("snmpget", "-v2c", "-c", "public", "-t", "1", "-r", "0", "-Ovq", endpoint, SYS_DESCR, check=False)
    return got.stdout.strip() if got.returncode == 0 else None


def test_ctl_stops_and_starts_a_device_that_managers_then_miss_and_find(network):
    assert network.summary == "5 devices running: routers 3/3, hosts 2/2"
    host, router = f"127.0.7.2:{HOST_PORT}", f"127.0.6.1:{ROUTER_PORT}"
    described = sys_descr(host)
    assert described and described != sys_descr(router), "each group serves its own data"

    stopped = ctl("stop", "127.0.7.2", "--admin", network.admin, "--token-file", str(network.token_file))
    assert stopped.returncode == 0, stopped.stderr
    assert re.search(r"^127\.0\.7\.2 +host-2 +hosts +stopped$", stopped.stdout, re.M), stopped.stdout
    assert sys_descr(host) is None
    assert sys_descr(router), "the other devices keep serving"

    started = ctl("--admin", network.admin, "start", "127.0.7.2", "--protocol", "snmp", "--token-file",
                  str(network.token_file))
    assert started.returncode == 0, started.stderr
    assert sys_descr(host) == described


def request_id_of_reply(address, port, request_id):
    """Sends a v2c Get of sysDescr.0 with request_id (below 128) from loopback; the request-id of the reply."""
    def tlv(tag, content):
        return bytes([tag, len(content)]) + content
    binding = tlv(0x30, tlv(0x06, bytes([0x2B, 6, 1, 2, 1, 1, 1, 0])) + b"\x05\x00")
    pdu = tlv(0xA0, tlv(0x02, bytes([request_id])) + b"\x02\x01\x00" * 2 + tlv(0x30, binding))
    message = tlv(0x30, b"\x02\x01\x01" + tlv(0x04, b"public") + pdu)
    with socket.socket(socket.AF_INET, socket.SOCK_DGRAM) as manager:
        manager.settimeout(2)
        manager.sendto(message, (address, port))
        reply = manager.recv(65535)
    # The engine's SEQUENCE headers take four octets: 30 82 LL LL, version, community, A2 82 LL LL.
    assert reply[15] == 0xA2 and reply[19:21] == b"\x02\x01", reply.hex()
    return reply[21]


def test_scrambled_replies_carry_another_request_id_until_scrambling_is_off(network):
    access = ("--admin", network.admin, "--token-file", str(network.token_file))
    scrambled, plain = f"127.0.6.2:{ROUTER_PORT}", f"127.0.6.3:{ROUTER_PORT}"
    on = ctl("scramble", "--devices", "127.0.6.2", "--responses", "reqid=5", *access)
    try:
        assert on.returncode == 0, on.stderr
        assert request_id_of_reply("127.0.6.2", ROUTER_PORT, 42) == 5
        assert sys_descr(scrambled) is None, "net-snmp waits for its own request-id and times out"
        assert sys_descr(plain), "a device not listed answers as ever"
    finally:
        off = ctl("scramble", "off", *access)
    assert off.returncode == 0, off.stderr
    assert off.stdout == "scrambling off\n"
    assert request_id_of_reply("127.0.6.2", ROUTER_PORT, 42) == 42
    assert sys_descr(scrambled) == sys_descr(plain)


class Browser:
    """Headless Chromium with a profile of its own, driven through the DevTools protocol on a pipe (it reads
    commands from descriptor 3 and writes answers to descriptor 4, each a JSON text ending in a NUL)."""

    def __init__(self, directory):
        assert shutil.which("chromium"), "chromium is missing: ./tessel installs it"
        commands, self.commands = os.pipe()
        self.answers, answers = os.pipe()

        def descriptors():  # in the child: the pipe ends at 3 and 4, kept across exec
            low = [fcntl.fcntl(fd, fcntl.F_DUPFD, 10) for fd in (commands, answers)]
            os.dup2(low[0], 3)
            os.dup2(low[1], 4)

        self.process = subprocess.Popen(
            ["chromium", "--headless", "--no-sandbox", "--disable-gpu", "--remote-debugging-pipe",
             f"--user-data-dir={directory}", "--window-size=1280,1000", "about:blank"],
            close_fds=False, preexec_fn=descriptors, stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL,
            stderr=subprocess.DEVNULL)
        os.close(commands)
        os.close(answers)
        self.pending, self.next_id, self.session = b"", 0, None

    def call(self, method, **params):
        self.next_id += 1
        message = {"id": self.next_id, "method": method, "params": params}
        if self.session:
            message["sessionId"] = self.session
        os.write(self.commands, json.dumps(message).encode() + b"\0")
        deadline = time.monotonic() + 30
        while True:
            while b"\0" not in self.pending:
                assert select.select([self.answers], [], [], max(0, deadline - time.monotonic()))[0], f"no answer to {method}"
                chunk = os.read(self.answers, 1 << 16)
                assert chunk, "chromium closed its DevTools pipe"
                self.pending += chunk
            text, self.pending = self.pending.split(b"\0", 1)
            answer = json.loads(text)
            if answer.get("id") == self.next_id:
                assert "error" not in answer, answer
                return answer["result"]

    def open(self, url):
        target = self.call("Target.createTarget", url=url)["targetId"]
        self.session = self.call("Target.attachToTarget", targetId=target, flatten=True)["sessionId"]

    def evaluate(self, expression):
        result = self.call("Runtime.evaluate", expression=expression, awaitPromise=True, returnByValue=True)
        assert "exceptionDetails" not in result, result
        return result["result"].get("value")

    def wait_for(self, expression, timeout=20):
        """Until `expression` holds; it may fail while the page is still loading."""
        deadline = time.monotonic() + timeout
        while not self.evaluate(f"(() => {{ try {{ return {expression}; }} catch (e) {{ return false; }} }})()"):
            assert time.monotonic() < deadline, f"the page never showed {expression}"
            time.sleep(0.2)

    def screenshot(self, path):
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_bytes(base64.b64decode(self.call("Page.captureScreenshot")["data"]))

    def close(self):
        self.process.terminate()
        self.process.wait(timeout=15)
        os.close(self.commands)
        os.close(self.answers)


def test_dashboard_asks_for_the_token_then_shows_and_starts_a_stopped_device(network, tmp_path):
    network.api("/api/devices/127.0.6.2/stop", "POST")
    manager = socket.socket(socket.AF_INET, socket.SOCK_DGRAM)  # takes the inform and never answers
    manager.bind(("127.0.0.1", 0))
    to = f"127.0.0.1:{manager.getsockname()[1]}"
    inform = urllib.request.Request(
        network.admin + "/api/devices/127.0.6.1/notifications", method="POST",
        data=json.dumps({"kind": "inform", "manager": to, "oid": "1.3.6.1.4.1.99.0.1", "timeout": 60}).encode(),
        headers={"Authorization": f"Bearer {TOKEN}", "Content-Type": "application/json"})
    with urllib.request.urlopen(inform, timeout=10) as answer:
        inform_id = json.load(answer)["id"]
    browser = Browser(tmp_path / "profile")
    try:
        browser.open(network.admin + "/")
        browser.wait_for('!document.getElementById("token-form").hidden')
        assert browser.evaluate('document.getElementById("device-count").textContent') == "–"
        browser.evaluate(f'document.getElementById("token-input").value = "{TOKEN}";'
                         'document.querySelector("#token-form form").requestSubmit()')
        browser.wait_for("document.body.dataset.refreshed")  # a whole refresh with the token
        assert browser.evaluate('document.getElementById("device-count").textContent') == "5"
        state = 'document.querySelector(\'tr[data-address="127.0.6.2"] .state\').textContent'
        assert browser.evaluate(state) == "stopped"
        assert browser.evaluate('document.querySelector(\'tr[data-group="routers"] [data-state="stopped"]\')'
                                '.textContent') == "1"
        assert browser.evaluate('document.getElementById("tl1-value").textContent') == \
            "TL1: 0 sessions, 0.0 commands/s"
        assert browser.evaluate(f'[...document.querySelectorAll(\'#informs tr[data-inform="{inform_id}"] td\')]'
                                '.map((cell) => cell.textContent)') == [str(inform_id), "127.0.6.1", to, "pending", "1"]
        SCREENSHOT.unlink(missing_ok=True)
        browser.screenshot(SCREENSHOT)
        assert SCREENSHOT.stat().st_size > 10_000

        browser.evaluate('document.querySelector(\'tr[data-address="127.0.6.2"] [data-action="start"]\').click()')
        browser.wait_for(f'{state} === "running"')
        assert network.api("/api/devices/127.0.6.2")["protocols"] == {"snmp": "running"}
    finally:
        browser.close()
        manager.close()
