#!/usr/bin/env python3
"""./tessel bench tl1: TL1 agents under load, on loopback. Measures, in one run:

- the TCP echo server (tessel_tl1load echo, one thread, epoll) with the same exchange the TL1 load
  makes: the ceiling of the machine for it;
- `./tessel run` with BENCH_TL1_DEVICES TL1 devices (flag form, profiles/optical.tl1, TL1 only) and
  with one: resident memory of each, hence the memory per further TL1 agent; the CPU the large
  network uses idle over BENCH_IDLE_SECONDS; RTRV-HDR round trips per second over BENCH_TL1_CONNECTIONS
  connections spread over as many devices, closed loop, with p50/p99; the same paced at half that
  rate (latency below saturation); and how many sessions per second open, answer one RTRV-HDR and
  close, one after another;
- the engine alone (tessel_tl1memory, no JVM) with as many agents: its share of the memory per agent.

Environment (defaults in brackets): BENCH_TL1_DEVICES [10000], BENCH_TL1_CONNECTIONS [100],
BENCH_TL1_ADDRESS [127.18.0.1], BENCH_TL1_ECHO_ADDRESS [127.19.0.1], BENCH_TL1_PORT [11401],
BENCH_DURATION [5] s per load figure, BENCH_WARMUP [1] s, BENCH_IDLE_SECONDS [10],
BENCH_TL1_SESSIONS [2000], BENCH_SERVER_CPU [0], BENCH_LOADGEN_CPU [1], BENCH_START_TIMEOUT [120] s.
Every process started here is stopped when the script ends; all traffic stays on loopback."""

import os
import re
import signal
import subprocess
import sys
import time
from pathlib import Path

ROOT = Path(__file__).resolve().parents[1]
BUILD = Path(os.environ.get("TESSEL_BUILD", ROOT / "build"))
LOAD = BUILD / "bench" / "tessel_tl1load"
MEMORY = BUILD / "bench" / "tessel_tl1memory"
DEVICES = int(os.environ.get("BENCH_TL1_DEVICES", 10000))
CONNECTIONS = int(os.environ.get("BENCH_TL1_CONNECTIONS", 100))
ADDRESS = os.environ.get("BENCH_TL1_ADDRESS", "127.18.0.1")
ECHO_ADDRESS = os.environ.get("BENCH_TL1_ECHO_ADDRESS", "127.19.0.1")
PORT = int(os.environ.get("BENCH_TL1_PORT", 11401))
DURATION = float(os.environ.get("BENCH_DURATION", 5))
WARMUP = float(os.environ.get("BENCH_WARMUP", 1))
IDLE_SECONDS = float(os.environ.get("BENCH_IDLE_SECONDS", 10))
SESSIONS = int(os.environ.get("BENCH_TL1_SESSIONS", 2000))
SERVER_CPU = os.environ.get("BENCH_SERVER_CPU", "0")
LOADGEN_CPU = os.environ.get("BENCH_LOADGEN_CPU", "1")
START_TIMEOUT = float(os.environ.get("BENCH_START_TIMEOUT", 120))
COMMAND = "RTRV-HDR:NE{n}::1;"  # the flag form names its TL1 devices NE1, NE2, ...
TICKS = os.sysconf("SC_CLK_TCK")


def log(text):
    print(f"bench tl1: {text}", file=sys.stderr, flush=True)


def load(mode, address, until, *extra):
    """One bounded run of the load tool; its RESULT fields as numbers."""
    command = ["taskset", "-c", LOADGEN_CPU, str(LOAD), mode, "--targets", f"{address}+{CONNECTIONS}", "--port",
               str(PORT), "--command", COMMAND, "--until", until, *extra]
    return result_fields(command, DURATION + WARMUP + 60)


def result_fields(command, timeout):
    """Runs a bench tool; the fields of its RESULT line as numbers."""
    result = subprocess.run(command, capture_output=True, text=True, timeout=timeout)
    line = next((l for l in result.stdout.splitlines() if l.startswith("RESULT")), None)
    if line is None:
        raise SystemExit(f"bench tl1: no result from {Path(command[3]).name}: {result.stdout}{result.stderr}")
    return {key: float(value) for key, value in re.findall(r"(\w+)=([0-9.]+)", line)}


def round_trips(address, until):
    return load("load", address, until, "--connections", str(CONNECTIONS), "--seconds", str(DURATION),
                "--warmup", str(WARMUP))


def paced(address, until, rate):
    return load("load", address, until, "--connections", str(CONNECTIONS), "--seconds", str(DURATION),
                "--warmup", str(WARMUP), "--rate", str(max(1, int(rate))))


def stop(process):
    try:
        os.killpg(process.pid, signal.SIGTERM)
        process.wait(timeout=30)
    except ProcessLookupError:
        pass
    except subprocess.TimeoutExpired:
        os.killpg(process.pid, signal.SIGKILL)
        process.wait()


def start_network(devices):
    """`./tessel run` serving `devices` TL1 devices, as users start it (the launcher's JVM options
    included: they set how much of the heap is resident); returns it once its summary line is out."""
    command = ["taskset", "-c", SERVER_CPU, str(ROOT / "tessel"), "run", "--tl1-data",
               str(ROOT / "profiles" / "optical.tl1"), "--devices", str(devices), "--address", ADDRESS,
               "--tl1-port", str(PORT), "--admin", "off", "--log-file", "/dev/null"]
    process = subprocess.Popen(command, stdout=subprocess.DEVNULL, stderr=subprocess.PIPE, text=True,
                               start_new_session=True)
    deadline = time.monotonic() + START_TIMEOUT
    while time.monotonic() < deadline:
        line = process.stderr.readline()
        if not line:
            raise SystemExit("bench tl1: the network ended before it served")
        log(line.strip())
        if " devices running: " in line:
            return process
    stop(process)
    raise SystemExit("bench tl1: the network did not serve in time")


def resident_kib(pid):
    for line in Path(f"/proc/{pid}/status").read_text().splitlines():
        if line.startswith("VmRSS:"):
            return int(line.split()[1])
    return 0


def cpu_seconds(pid):
    fields = Path(f"/proc/{pid}/stat").read_text().rsplit(")", 1)[1].split()
    return (int(fields[11]) + int(fields[12])) / TICKS  # utime and stime


def echo_ceiling():
    echo = subprocess.Popen(["taskset", "-c", SERVER_CPU, str(LOAD), "echo", "--targets",
                             f"{ECHO_ADDRESS}+{CONNECTIONS}", "--port", str(PORT), "--seconds",
                             str(2 * (DURATION + WARMUP) + 30)], stdout=subprocess.PIPE, text=True,
                            start_new_session=True)
    try:
        if echo.stdout.readline().strip() != "listening":
            raise SystemExit("bench tl1: the echo server did not listen")
        return round_trips(ECHO_ADDRESS, ";")
    finally:
        stop(echo)


def tl1_figures():
    small = start_network(1)
    try:
        time.sleep(1)
        small_kib = resident_kib(small.pid)
    finally:
        stop(small)
    large = start_network(DEVICES)
    try:
        time.sleep(2)
        large_kib = resident_kib(large.pid)
        before, start = cpu_seconds(large.pid), time.monotonic()
        time.sleep(IDLE_SECONDS)
        idle = (cpu_seconds(large.pid) - before) / (time.monotonic() - start) * 100
        saturated = round_trips(ADDRESS, "TL1>>")
        half = paced(ADDRESS, "TL1>>", saturated["rate"] / 2)
        sessions = load("connect", ADDRESS, "TL1>>", "--count", str(SESSIONS), "--seconds", "60")
    finally:
        stop(large)
    per_agent = (large_kib - small_kib) / max(1, DEVICES - 1)
    return small_kib, large_kib, per_agent, idle, saturated, half, sessions


def engine_share():
    """Heap bytes per further agent of the engine alone, on addresses of its own."""
    return result_fields(["taskset", "-c", SERVER_CPU, str(MEMORY), "--agents", str(DEVICES), "--address",
                          ECHO_ADDRESS, "--port", str(PORT)], 120)


def main():
    subprocess.run(["cmake", "--build", str(BUILD), "--target", "tessel_tl1load", "tessel_tl1memory", "tessel",
                    "tessel_host"], check=True, stdout=subprocess.DEVNULL)
    echo = echo_ceiling()
    engine = engine_share()
    small_kib, large_kib, per_agent, idle, saturated, half, sessions = tl1_figures()
    print(f"TL1 bench: {CONNECTIONS} connections over {CONNECTIONS} devices, {DURATION:g} s per figure")
    print(f"{'':34}{'exchanges/s':>12}{'p50 us':>10}{'p99 us':>10}")
    print(f"{'TCP echo (ceiling)':34}{echo['rate']:12.0f}{echo['p50_us']:10.1f}{echo['p99_us']:10.1f}")
    print(f"{'TL1 RTRV-HDR, closed loop':34}{saturated['rate']:12.0f}{saturated['p50_us']:10.1f}"
          f"{saturated['p99_us']:10.1f}")
    print(f"{'TL1 RTRV-HDR, paced at half':34}{half['rate']:12.0f}{half['p50_us']:10.1f}{half['p99_us']:10.1f}")
    print(f"TL1/echo: {saturated['rate'] / echo['rate']:.2f}")
    print(f"sessions opened, answered once and closed: {sessions['rate']:.0f}/s ({sessions['errors']:.0f} errors)")
    print(f"resident memory: 1 device {small_kib / 1024:.1f} MiB, {DEVICES} devices {large_kib / 1024:.1f} MiB; "
          f"{per_agent * 1024:.0f} bytes per further TL1 agent")
    print(f"the engine alone: {engine['heap_per_agent']:.0f} bytes of heap per further TL1 agent "
          f"({engine['rss_per_agent']:.0f} resident)")
    print(f"idle CPU with {DEVICES} TL1 agents: {idle:.2f} % of a core over {IDLE_SECONDS:g} s")


if __name__ == "__main__":
    main()
