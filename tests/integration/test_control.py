"""The control interface end to end: `./tessel ctl` and the dashboard in a real browser drive a network
started from a network file, and SNMP managers see what they did."""

import json
import re
import shutil
import subprocess

import pytest

from conftest import BASE_PORT, BUILD, PROFILE, ROOT, FileNetwork, snmp

ROUTER_PORT, HOST_PORT, ADMIN_PORT, SILENT_PORT = BASE_PORT + 4, BASE_PORT + 6, BASE_PORT + 8, BASE_PORT + 9
HOST_DATA = ROOT / "host" / "src" / "test" / "resources" / "data" / "linux-host.walk"
SYS_DESCR = "1.3.6.1.2.1.1.1.0"
SCREENSHOT = BUILD / "tests" / "integration" / "dashboard.png"


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
        """, ADMIN_PORT)
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

    stopped = ctl("stop", "127.0.7.2", "--admin", network.admin)
    assert stopped.returncode == 0, stopped.stderr
    assert re.search(r"^127\.0\.7\.2 +host-2 +hosts +stopped$", stopped.stdout, re.M), stopped.stdout
    assert sys_descr(host) is None
    assert sys_descr(router), "the other devices keep serving"

    listed = ctl("--json", "--admin", network.admin, "devices")
    assert listed.returncode == 0, listed.stderr
    devices = json.loads(listed.stdout)
    assert devices["total"] == 5
    assert {d["address"]: (d["group"], d["protocols"]) for d in devices["devices"]} == {
        "127.0.6.1": ("routers", {"snmp": "running"}), "127.0.6.2": ("routers", {"snmp": "running"}),
        "127.0.6.3": ("routers", {"snmp": "running"}), "127.0.7.1": ("hosts", {"snmp": "running"}),
        "127.0.7.2": ("hosts", {"snmp": "stopped"})}
    only_stopped = ctl("devices", "--state", "stopped", "--admin", network.admin)
    assert [line.split()[0] for line in only_stopped.stdout.splitlines()[1:]] == ["127.0.7.2"]

    started = ctl("--admin", network.admin, "start", "127.0.7.2", "--protocol", "snmp")
    assert started.returncode == 0, started.stderr
    assert sys_descr(host) == described


def test_ctl_exit_status_tells_a_refusal_from_a_silent_network(network):
    unknown = ctl("device", "127.0.9.9", "--admin", network.admin)
    assert unknown.returncode == 1 and unknown.stderr.strip(), unknown
    silent = ctl("stats", "--admin", f"127.0.0.1:{SILENT_PORT}")
    assert silent.returncode == 3 and f"http://127.0.0.1:{SILENT_PORT}" in silent.stderr, silent


def chromium(directory, *args):
    """Headless Chromium with a profile of its own on the dashboard, after its first refreshes."""
    assert shutil.which("chromium"), "chromium is missing: ./tessel installs it"
    return subprocess.run(["chromium", "--headless", "--no-sandbox", "--disable-gpu", f"--user-data-dir={directory}",
                           "--virtual-time-budget=6000", "--window-size=1280,1000", *args],
                          capture_output=True, text=True, timeout=120)


def test_dashboard_shows_the_network_in_a_browser(network, tmp_path):
    network.api("/api/devices/127.0.6.2/stop", "POST")
    try:
        page = chromium(tmp_path / "profile", "--dump-dom", network.admin + "/")
        dom = page.stdout
        assert 'data-refreshed="' in dom, f"the page never finished a refresh: {page.stderr[-2000:]}"
        assert re.search(r'id="device-count">5<', dom)
        row = re.search(r'<tr[^>]*id="device-127\.0\.6\.2"[^>]*>(.*?)</tr>', dom, re.S)
        assert row and "R2" in row.group(1) and ">stopped<" in row.group(1), dom
        routers = re.search(r'<tr data-group="routers">(.*?)</tr>', dom, re.S)
        assert routers and re.search(r'data-state="stopped">1<', routers.group(1)), dom

        SCREENSHOT.parent.mkdir(parents=True, exist_ok=True)
        SCREENSHOT.unlink(missing_ok=True)
        chromium(tmp_path / "profile", f"--screenshot={SCREENSHOT}", network.admin + "/")
        assert SCREENSHOT.stat().st_size > 10_000
    finally:
        network.api("/api/devices/127.0.6.2/start", "POST")
