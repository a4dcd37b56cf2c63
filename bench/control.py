#!/usr/bin/env python3
"""./tessel bench control: the control interface of a large network. Starts `./tessel run` with
BENCH_CONTROL_DEVICES devices (devices beyond what the open-file limit allows are listed as failed,
so the device table holds all of them) and its control interface on loopback, then measures

- the latency of `GET /api/devices?limit=1000` and of `GET /metrics` (p50, p90 and the slowest of
  BENCH_CONTROL_REPEATS requests each, after a few unmeasured ones);
- the SNMP Get rate to one device (tessel_loadgen, as `./tessel bench` runs it) while nobody asks
  the control interface and while a poller asks it as four dashboards would (/api/network,
  /api/stats, /api/devices and /metrics every 0.5 s), alternating BENCH_CONTROL_ROUNDS times.

Environment (defaults in brackets): BENCH_CONTROL_DEVICES [50000], BENCH_CONTROL_ADDRESS
[127.16.0.1], BENCH_CONTROL_PORT [11201] (SNMP), BENCH_CONTROL_ADMIN_PORT [11301],
BENCH_CONTROL_REPEATS [30], BENCH_CONTROL_ROUNDS [3], BENCH_DURATION [5] seconds per Get figure,
BENCH_SERVER_CPU [0], BENCH_LOADGEN_CPU [1], BENCH_START_TIMEOUT [300] seconds.
Every process started here is stopped when the script ends; all traffic stays on loopback."""

import os
import re
import signal
import statistics
import subprocess
import sys
import threading
import time
import urllib.request
from pathlib import Path

ROOT = Path(__file__).resolve().parents[1]
BUILD = Path(os.environ.get("TESSEL_BUILD", ROOT / "build"))
DEVICES = int(os.environ.get("BENCH_CONTROL_DEVICES", 50000))
ADDRESS = os.environ.get("BENCH_CONTROL_ADDRESS", "127.16.0.1")
PORT = int(os.environ.get("BENCH_CONTROL_PORT", 11201))
ADMIN = f"127.0.0.1:{int(os.environ.get('BENCH_CONTROL_ADMIN_PORT', 11301))}"
REPEATS = int(os.environ.get("BENCH_CONTROL_REPEATS", 30))
ROUNDS = int(os.environ.get("BENCH_CONTROL_ROUNDS", 3))
DURATION = os.environ.get("BENCH_DURATION", "5")
SERVER_CPU = os.environ.get("BENCH_SERVER_CPU", "0")
LOADGEN_CPU = os.environ.get("BENCH_LOADGEN_CPU", "1")
START_TIMEOUT = float(os.environ.get("BENCH_START_TIMEOUT", 300))
POLLED = ("/api/network", "/api/stats", "/api/devices?limit=100", "/metrics")


def log(text):
    print(f"bench control: {text}", file=sys.stderr, flush=True)


def fetch(path):
    with urllib.request.urlopen(f"http://{ADMIN}{path}", timeout=30) as answer:
        return answer.read()


def latency_ms(path):
    for _ in range(3):
        fetch(path)
    times = []
    for _ in range(REPEATS):
        start = time.perf_counter()
        body = fetch(path)
        times.append((time.perf_counter() - start) * 1000)
    times.sort()
    return statistics.median(times), times[int(len(times) * 0.9) - 1], times[-1], len(body)


def get_rate():
    result = subprocess.run(
        [str(BUILD / "bench" / "tessel_loadgen"), "--targets", ADDRESS, "--port", str(PORT),
         "--get", "1.3.6.1.2.1.1.5.0", "--window", "64", "--warmup", "1", "--duration", DURATION,
         "--cpu", LOADGEN_CPU, "--quiet"], capture_output=True, text=True, timeout=float(DURATION) + 60)
    match = re.search(r" rate=([0-9]+)", result.stdout)
    if not match:
        raise SystemExit(f"bench control: no load generator result: {result.stdout}{result.stderr}")
    return int(match.group(1))


def poll_until(stop, counts):
    while not stop.wait(0.5):
        for path in POLLED:
            fetch(path)
            counts[0] += 1


def start_network():
    command = ["taskset", "-c", SERVER_CPU, str(ROOT / "tessel"), "run", "--devices", str(DEVICES),
               "--address", ADDRESS, "--snmp-port", str(PORT), "--admin", ADMIN]
    process = subprocess.Popen(command, stdout=subprocess.DEVNULL, stderr=subprocess.PIPE, text=True,
                               start_new_session=True)
    deadline = time.monotonic() + START_TIMEOUT
    while time.monotonic() < deadline:
        line = process.stderr.readline()
        if not line:
            raise SystemExit("bench control: the network ended before it served")
        if " devices running: " in line:
            log(line.strip())
            return process
        log(line.strip())
    raise SystemExit("bench control: the network did not serve in time")


def main():
    subprocess.run(["cmake", "--build", str(BUILD), "--target", "tessel_loadgen", "tessel", "tessel_host"],
                   check=True, stdout=subprocess.DEVNULL)
    process = start_network()
    try:
        rows = []
        for path in ("/api/devices?limit=1000", "/metrics"):
            p50, p90, worst, size = latency_ms(path)
            rows.append(f"GET {path:<26} p50 {p50:6.1f} ms  p90 {p90:6.1f} ms  max {worst:6.1f} ms  ({size} bytes)")
        quiet, polled, requests = [], [], [0]
        for _ in range(ROUNDS):
            quiet.append(get_rate())
            stop = threading.Event()
            poller = threading.Thread(target=poll_until, args=(stop, requests))
            poller.start()
            try:
                polled.append(get_rate())
            finally:
                stop.set()
                poller.join()
        print(f"control interface with {DEVICES} devices in the table")
        for row in rows:
            print(row)
        print(f"SNMP Get/s, control interface idle:   {' '.join(map(str, quiet))} (median {statistics.median(quiet):.0f})")
        print(f"SNMP Get/s, control interface polled: {' '.join(map(str, polled))} "
              f"(median {statistics.median(polled):.0f}; {requests[0]} API requests)")
        print(f"polled/idle: {statistics.median(polled) / statistics.median(quiet):.2f}")
    finally:
        os.killpg(process.pid, signal.SIGTERM)
        try:
            process.wait(timeout=30)
        except subprocess.TimeoutExpired:
            os.killpg(process.pid, signal.SIGKILL)


if __name__ == "__main__":
    main()
