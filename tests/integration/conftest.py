"""Fixtures that start real networks on loopback: Tessel through its launcher (the reference host in
a real JVM) and, for comparison, snmpsim serving the same data. Every process is stopped by its
fixture; all traffic stays on 127.0.0.0/8."""

import os
import shutil
import signal
import subprocess
import tempfile
import time
from pathlib import Path

import pytest

ROOT = Path(__file__).resolve().parents[2]
BUILD = Path(os.environ.get("TESSEL_BUILD", ROOT / "build"))
JAVA = Path(os.environ.get("JAVA_HOME", "/usr/lib/jvm/java-17-openjdk-amd64")) / "bin" / "java"
PROFILE = ROOT / "profiles" / "router.snmprec"
# A port range of this run's own, so that concurrent runs on one machine do not meet.
BASE_PORT = 30000 + (os.getpid() % 2000) * 10


def host_jar():
    jars = sorted(BUILD.glob("host/tessel-host*.jar"))
    jars = [j for j in jars if "tests" not in j.name]
    assert jars, f"host jar not found under {BUILD}/host"
    return jars[0]


def launcher_command(data, devices, address, port, extra=()):
    """The command line that starts the launcher in a JVM with these options."""
    return [str(JAVA), f"-Dtessel.library={BUILD / 'src' / 'libtessel.so'}",
            f"-Dtessel.profiles.dir={ROOT / 'profiles'}", "-cp", str(host_jar()),
            "com.kestrelon.simulator.tessel.Launcher", "--snmp-data", str(data), "--devices", str(devices),
            "--address", address, "--snmp-port", str(port), *extra]


class Network:
    """A Tessel network started with the launcher's options, `extra` appended to them (such as
    ("--snmpv3", path)); devices at address + i. The launcher finds the default SNMPv3
    configuration in the source tree's profiles/."""

    def __init__(self, data, devices, address, port, extra=()):
        self.address, self.port, self.devices = address, port, devices
        self.workdir = tempfile.mkdtemp(prefix="tessel-it-")
        self.process = subprocess.Popen(launcher_command(data, devices, address, port, extra), cwd=self.workdir, stdout=subprocess.PIPE,
                                        stderr=subprocess.PIPE, text=True)
        self.started = self._wait_for_agents()

    def _wait_for_agents(self):
        lines, deadline = [], time.monotonic() + 60
        while time.monotonic() < deadline:
            line = self.process.stdout.readline()
            if not line:
                break
            lines.append(line.rstrip("\n"))
            if sum("Snmp Agent Started" in l for l in lines) + sum("Unable to start" in l for l in lines) \
                    >= self.devices:
                return lines
        raise AssertionError(f"network did not start: {lines} {self.process.stderr.read() if self.process.poll() is not None else ''}")

    def agent(self, i):
        a = [int(x) for x in self.address.split(".")]
        value = ((a[0] << 24) | (a[1] << 16) | (a[2] << 8) | a[3]) + i
        return f"{value >> 24 & 255}.{value >> 16 & 255}.{value >> 8 & 255}.{value & 255}:{self.port}"

    def stop(self):
        self.process.send_signal(signal.SIGTERM)
        try:
            status = self.process.wait(timeout=15)
        except subprocess.TimeoutExpired:
            self.process.kill()
            raise
        shutil.rmtree(self.workdir, ignore_errors=True)
        return status


class Simulator:
    """snmpsim serving one data file (as community `public`), run as nobody."""

    def __init__(self, data, port, suffix):
        self.datadir = Path(tempfile.mkdtemp(prefix="tessel-sim-"))
        shutil.copy(data, self.datadir / f"public.{suffix}")
        os.chmod(self.datadir, 0o755)
        os.chmod(self.datadir / f"public.{suffix}", 0o644)
        (self.datadir / "cache").mkdir(mode=0o777)
        os.chmod(self.datadir / "cache", 0o777)  # snmpsim writes its index there as nobody
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
        self.process.terminate()
        try:
            self.process.wait(timeout=10)
        except subprocess.TimeoutExpired:
            self.process.kill()
        shutil.rmtree(self.datadir, ignore_errors=True)


def snmp(tool, *args, check=True):
    """Runs a net-snmp tool; numeric OIDs, no MIB lookups."""
    result = subprocess.run([tool, "-M", "/dev/null", "-m", "", *args], capture_output=True, text=True,
                            timeout=60)
    if check and result.returncode != 0:
        raise AssertionError(f"{tool} {args} failed: {result.stderr}")
    return result


def lines(tool, *args):
    return [l for l in snmp(tool, "-On", *args).stdout.splitlines() if l]


@pytest.fixture(scope="session")
def network():
    net = Network(PROFILE, 3, "127.0.3.1", BASE_PORT)
    yield net
    assert net.stop() == 0


@pytest.fixture(scope="session")
def simulator():
    sim = Simulator(PROFILE, BASE_PORT + 1, "snmprec")
    yield sim
    sim.stop()
