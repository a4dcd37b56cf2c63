"""Fixtures that start real networks on loopback: Tessel through its launcher (the reference host in
a real JVM) and, for comparison, snmpsim serving the same data. Every process is stopped by its
fixture; all traffic stays on 127.0.0.0/8."""

import ipaddress
import json
import os
import queue
import re
import shutil
import signal
import subprocess
import tempfile
import textwrap
import threading
import time
import urllib.request
from pathlib import Path

import pytest

ROOT = Path(__file__).resolve().parents[2]
BUILD = Path(os.environ.get("TESSEL_BUILD", ROOT / "build"))
JAVA = Path(os.environ.get("JAVA_HOME", "/usr/lib/jvm/java-17-openjdk-amd64")) / "bin" / "java"
PROFILE = ROOT / "profiles" / "router.snmprec"
# A port range of this run's own, so that concurrent runs on one machine do not meet.
BASE_PORT = 30000 + (os.getpid() % 2000) * 10


def launcher(*args):
    """The command line that runs the launcher from the build folder with `args`."""
    jars = [j for j in sorted(BUILD.glob("host/tessel-host*.jar")) if "tests" not in j.name]
    assert jars, f"host jar not found under {BUILD}/host"
    return [str(JAVA), f"-Dtessel.library={BUILD / 'src' / 'libtessel.so'}", f"-Dtessel.profiles.dir={ROOT / 'profiles'}",
            "-cp", str(jars[0]), "com.kestrelon.simulator.tessel.Launcher", *args]


class Network:
    """A Tessel network started with the launcher's options, `extra` appended to them (such as
    ("--snmpv3", path)); devices at address + i. The launcher finds the default SNMPv3
    configuration in the source tree's profiles/."""

    def __init__(self, data, devices, address, port, extra=()):
        self.address, self.port, self.devices = address, port, devices
        self.workdir = tempfile.mkdtemp(prefix="tessel-it-")
        command = launcher("--snmp-data", str(data), "--devices", str(devices), "--address", address,
                           "--snmp-port", str(port), "--admin", "off", *extra)
        self.process = subprocess.Popen(command, cwd=self.workdir, stdout=subprocess.PIPE, stderr=subprocess.PIPE,
                                        text=True)
        lines, deadline = [], time.monotonic() + 60
        while time.monotonic() < deadline and len(lines) < devices:
            line = self.process.stdout.readline()
            if not line:
                raise AssertionError(f"network did not start: {self.process.stderr.read()}")
            if "Snmp Agent Started" in line or "Unable to start" in line:
                lines.append(line)
        assert len(lines) == devices, f"network did not start in time: {lines}"

    def agent(self, i):
        return f"{ipaddress.IPv4Address(self.address) + i}:{self.port}"

    def stop(self):
        return stop(self.process, self.workdir)


class FileNetwork:
    """A network that a network file describes, started by the launcher with its control interface on
    127.0.0.1:admin_port, which needs `token` when one is given. `groups` is the YAML text of the file's group
    list; its log, state and token file stay in a folder of its own. Ready once the launcher's summary line is
    on standard error."""

    SUMMARY = re.compile(r"^\d+ devices running: ")

    def __init__(self, groups, admin_port, token=None, top=""):
        self.workdir = Path(tempfile.mkdtemp(prefix="tessel-net-"))
        self.admin = f"http://127.0.0.1:{admin_port}"
        path = self.workdir / "network.yaml"
        path.write_text(f"log: {{level: 0, file: tessel.log}}\nstate-dir: {self.workdir / 'state'}\n"
                        f"{textwrap.dedent(top).strip()}\n"
                        f"groups:\n{textwrap.indent(textwrap.dedent(groups).strip(), '  ')}\n")
        self.token, self.token_file = token, self.workdir / "token"
        access = ("--admin", f"127.0.0.1:{admin_port}")
        if token:
            self.token_file.write_text(f"{token}\n")
            access += ("--admin-token-file", str(self.token_file))
        self.output = open(self.workdir / "status.txt", "w")  # the engine's status lines
        self.process = subprocess.Popen(launcher("--network", str(path), *access), cwd=self.workdir,
                                        stdout=self.output, stderr=subprocess.PIPE, text=True)
        self.errors = queue.Queue()
        threading.Thread(target=self._read_errors, daemon=True).start()
        self.summary = self._wait_for_summary(time.monotonic() + 60)

    def _read_errors(self):
        for line in self.process.stderr:
            self.errors.put(line.rstrip("\n"))
        self.errors.put(None)

    def _wait_for_summary(self, deadline):
        seen = []
        while time.monotonic() < deadline:
            try:
                line = self.errors.get(timeout=max(0.1, deadline - time.monotonic()))
            except queue.Empty:
                break
            if line is None:
                break
            seen.append(line)
            if self.SUMMARY.match(line):
                return line
        self.stop()
        raise AssertionError(f"network did not start: {seen}")

    def api(self, path, method="GET"):
        """The control interface's JSON answer to one request."""
        request = urllib.request.Request(self.admin + path, method=method)
        if self.token:
            request.add_header("Authorization", f"Bearer {self.token}")
        with urllib.request.urlopen(request, timeout=10) as answer:
            return json.load(answer)

    def stop(self):
        self.output.close()
        return stop(self.process, self.workdir)


class Simulator:
    """snmpsim serving one data file (as community `public`), run as nobody."""

    def __init__(self, data, port):
        self.datadir = Path(tempfile.mkdtemp(prefix="tessel-sim-"))
        shutil.copy(data, self.datadir / "public.snmprec")
        (self.datadir / "cache").mkdir()
        for path, mode in ((self.datadir, 0o755), (self.datadir / "public.snmprec", 0o644),
                           (self.datadir / "cache", 0o777)):  # snmpsim reads and indexes as nobody
            os.chmod(path, mode)
        self.endpoint = f"127.0.0.1:{port}"
        self.process = subprocess.Popen(
            ["snmpsimd", f"--data-dir={self.datadir}", f"--agent-udpv4-endpoint={self.endpoint}",
             "--process-user=nobody", "--process-group=nogroup", f"--cache-dir={self.datadir}/cache"],
            stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        deadline = time.monotonic() + 30
        while time.monotonic() < deadline:
            if snmp("snmpget", "-v2c", "-c", "public", "-t", "1", "-r", "0", self.endpoint,
                    "1.3.6.1.2.1.1.1.0", check=False).returncode == 0:
                return
            time.sleep(0.3)
        self.stop()
        raise AssertionError("snmpsim did not start")

    def stop(self):
        stop(self.process, self.datadir)


def stop(process, directory):
    """Ends process (SIGTERM, SIGKILL after 15 s) and removes its directory; the exit status."""
    process.send_signal(signal.SIGTERM)
    try:
        return process.wait(timeout=15)
    except subprocess.TimeoutExpired:
        process.kill()
        raise
    finally:
        shutil.rmtree(directory, ignore_errors=True)


def snmp(tool, *args, check=True):
    """Runs a net-snmp tool; numeric OIDs, no MIB lookups."""
    result = subprocess.run([tool, "-M", "/dev/null", "-m", "", *args], capture_output=True, text=True,
                            timeout=60)
    if check and result.returncode != 0:
        raise AssertionError(f"{tool} {args} failed: {result.stderr}")
    return result


def lines(tool, *args):
    return [l for l in snmp(tool, "-On", *args).stdout.splitlines() if l]


def walk(tool, endpoint, *options):
    """The objects a walk returns, without the end-of-MIB markers a bulk reply may repeat and without
    the engine's own SNMPv3 objects (snmpEngine, snmpMPDStats, usmStats): recorded data lacks them, and
    their counters and time move with every exchange."""
    return [l for l in lines(tool, *options, endpoint, "1.3")
            if "No more variables left" not in l and l != "End of MIB" and not l.startswith(".1.3.6.1.6.3.")]


@pytest.fixture(scope="session")
def network():
    net = Network(PROFILE, 3, "127.0.3.1", BASE_PORT)
    yield net
    assert net.stop() == 0


@pytest.fixture(scope="session")
def simulator():
    sim = Simulator(PROFILE, BASE_PORT + 1)
    yield sim
    sim.stop()
