#!/usr/bin/python3
"""Start-up time and memory of a Tessel network with many agents.

    bench/agent_memory.py 1000 15000              # one line per agent count, then the marginal
    bench/agent_memory.py --reports DIR 1000 15000  # also smaps and jcmd reports, per count

Each run launches `./tessel run --devices N --address A --snmp-port P` in its own process group
and polls the last agent with a v2c Get of sysName.0 until it answers: last_answer_s is the time
from launch, cpu_s the CPU seconds the network had used by then. It then sends one Get to every
agent (again to the silent ones, at most 10 rounds), waits a second, reads VmRSS summed over the
process group, and stops the network with SIGTERM (stop_s, exit status). The marginal cost per
agent is (RSS(largest N) - RSS(smallest N)) / (difference in N). With --reports, DIR gets
smaps-N.txt and jcmd-N.txt (GC.heap_info, GC.class_histogram, which collects the heap, then
GC.heap_info again; VM.native_memory summary when JAVA_TOOL_OPTIONS holds
-XX:NativeMemoryTracking=summary). All traffic goes to 127.0.0.0/8.
"""

import argparse
import ipaddress
import os
import select
import signal
import socket
import subprocess
import sys
import time
from pathlib import Path

ROOT = Path(__file__).resolve().parents[1]
SYS_NAME = (1, 3, 6, 1, 2, 1, 1, 5, 0)


def ber_length(n):
    if n < 0x80:
        return bytes([n])
    body = n.to_bytes((n.bit_length() + 7) // 8, "big")
    return bytes([0x80 | len(body)]) + body


def tlv(tag, body):
    return bytes([tag]) + ber_length(len(body)) + body


def ber_int(value):
    return tlv(0x02, value.to_bytes(max(1, (value.bit_length() + 8) // 8), "big", signed=True))


def ber_oid(subids):
    body = bytearray([subids[0] * 40 + subids[1]])
    for sub in subids[2:]:
        chunk = [sub & 0x7F]
        sub >>= 7
        while sub:
            chunk.append(0x80 | (sub & 0x7F))
            sub >>= 7
        body.extend(reversed(chunk))
    return tlv(0x06, bytes(body))


def get_request(request_id, community=b"public"):
    varbind = tlv(0x30, ber_oid(SYS_NAME) + b"\x05\x00")
    pdu = tlv(0xA0, ber_int(request_id) + ber_int(0) + ber_int(0) + tlv(0x30, varbind))
    return tlv(0x30, ber_int(1) + tlv(0x04, community) + pdu)


def group_files(pgid, name):
    """The text of /proc/PID/NAME for each live process of the group."""
    for entry in os.listdir("/proc"):
        if not entry.isdigit():
            continue
        try:
            if os.getpgid(int(entry)) == pgid:
                with open(f"/proc/{entry}/{name}") as file:
                    yield file.read()
        except OSError:
            continue


def group_cpu_s(pgid):
    """User plus system CPU seconds of the process group's live processes."""
    ticks = 0
    for stat in group_files(pgid, "stat"):
        fields = stat.rsplit(")", 1)[1].split()
        ticks += int(fields[11]) + int(fields[12])
    return ticks / os.sysconf("SC_CLK_TCK")


def group_rss_kib(pgid):
    """VmRSS summed over the process group."""
    total = 0
    for status in group_files(pgid, "status"):
        for line in status.splitlines():
            if line.startswith("VmRSS:"):
                total += int(line.split()[1])
    return total


class Prober:
    """One UDP socket; answers are told apart by their source address."""

    def __init__(self, port):
        self.port = port
        self.sock = socket.socket(socket.AF_INET, socket.SOCK_DGRAM)
        self.sock.setsockopt(socket.SOL_SOCKET, socket.SO_RCVBUF, 8 << 20)
        self.sock.bind(("127.0.0.1", 0))
        self.packet = get_request(1)

    def send(self, address):
        try:
            self.sock.sendto(self.packet, (address, self.port))
        except OSError:
            pass  # an address that is not served yet

    def drain(self, wait):
        answered = set()
        deadline = time.monotonic() + wait
        while True:
            left = deadline - time.monotonic()
            if left <= 0 or not select.select([self.sock], [], [], left)[0]:
                return answered
            while True:
                try:
                    _, source = self.sock.recvfrom(2048, socket.MSG_DONTWAIT)
                except BlockingIOError:
                    break
                answered.add(source[0])


def addresses(first, count):
    base = int(ipaddress.IPv4Address(first))
    return [str(ipaddress.IPv4Address(base + i)) for i in range(count)]


def wait_last(prober, last, process, timeout):
    deadline = time.monotonic() + timeout
    while time.monotonic() < deadline and process.poll() is None:
        prober.send(last)
        if last in prober.drain(0.02):
            return True
    return False


def sweep_all(prober, targets):
    silent = set(targets)
    for _ in range(10):
        for i, address in enumerate(sorted(silent)):
            prober.send(address)
            if i % 256 == 255:
                silent -= prober.drain(0.001)
        silent -= prober.drain(0.5)
        if not silent:
            break
    return len(targets) - len(silent)


def jcmd(pid, command, out):
    result = subprocess.run(["/usr/lib/jvm/java-17-openjdk-amd64/bin/jcmd", str(pid), *command],
                            capture_output=True, text=True, timeout=60)
    out.write(f"### jcmd {' '.join(command)}\n{result.stdout}{result.stderr}\n")
    return result.stdout


def heap_used_kib(heap_info):
    """Used KiB summed over the heap's generations ("... total NK, used NK" lines)."""
    used = 0
    for line in heap_info.splitlines():
        words = line.replace(",", " ").split()
        if "total" in words and "used" in words:
            used += int(words[words.index("used") + 1].rstrip("K"))
    return used


def run(devices, args):
    targets = addresses(args.address, devices)
    prober = Prober(args.port)
    command = [str(ROOT / "tessel"), "run", "--devices", str(devices), "--address", args.address,
               "--snmp-port", str(args.port)]
    started = time.monotonic()
    process = subprocess.Popen(command, stdout=subprocess.DEVNULL, stderr=subprocess.PIPE,
                               start_new_session=True, cwd="/tmp")
    row = {"devices": devices}
    try:
        if not wait_last(prober, targets[-1], process, args.timeout):
            row["error"] = "the last agent did not answer"
            return row
        row["last_answer_s"] = time.monotonic() - started
        row["cpu_s"] = group_cpu_s(process.pid)
        row["answered"] = sweep_all(prober, targets)
        time.sleep(args.settle)
        if process.poll() is not None:
            row["error"] = f"the network ended by itself (status {process.returncode})"
            return row
        row["rss_kib"] = group_rss_kib(process.pid)
        if args.reports:
            with open(f"{args.reports}/jcmd-{devices}.txt", "w") as out:
                java = subprocess.run(["pgrep", "-g", str(process.pid), "java"],
                                      capture_output=True, text=True).stdout.split()
                pid = java[0] if java else process.pid
                with open(f"/proc/{pid}/smaps") as smaps, \
                        open(f"{args.reports}/smaps-{devices}.txt", "w") as copy:
                    copy.write(smaps.read())
                row["heap_used_kib"] = heap_used_kib(jcmd(pid, ["GC.heap_info"], out))
                jcmd(pid, ["GC.class_histogram"], out)
                jcmd(pid, ["VM.native_memory", "summary"], out)
                row["heap_after_gc_kib"] = heap_used_kib(jcmd(pid, ["GC.heap_info"], out))
    finally:
        stop = time.monotonic()
        try:
            os.killpg(process.pid, signal.SIGTERM)
            row["status"] = process.wait(timeout=30)
            row["stop_s"] = time.monotonic() - stop
        except (ProcessLookupError, subprocess.TimeoutExpired):
            os.killpg(process.pid, signal.SIGKILL)
            row["status"] = "killed"
        err = process.stderr.read().decode(errors="replace").strip()
        if err:
            row["stderr"] = err[-300:]
    return row


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("devices", type=int, nargs="+")
    parser.add_argument("--address", default="127.1.0.1")
    parser.add_argument("--port", type=int, default=11201)
    parser.add_argument("--timeout", type=float, default=120, help="seconds for the last agent")
    parser.add_argument("--settle", type=float, default=1, help="seconds before reading RSS")
    parser.add_argument("--reports", metavar="DIR",
                        help="write smaps and jcmd heap, histogram and native memory reports to DIR")
    args = parser.parse_args()
    rows = []
    for devices in args.devices:
        row = run(devices, args)
        print(" ".join(f"{k}={v:.2f}" if isinstance(v, float) else f"{k}={v}"
                       for k, v in row.items()), flush=True)
        rows.append(row)
    good = [r for r in rows if "rss_kib" in r]
    if len(good) >= 2:
        low, high = min(good, key=lambda r: r["devices"]), max(good, key=lambda r: r["devices"])
        if high["devices"] > low["devices"]:
            per_agent = (high["rss_kib"] - low["rss_kib"]) * 1024 / (high["devices"] - low["devices"])
            print(f"marginal: {per_agent:.0f} bytes/agent ({per_agent / 1024:.2f} KiB) "
                  f"between {low['devices']} and {high['devices']} agents")
    return 0 if good and all(r.get("answered") == r["devices"] for r in good) else 1


if __name__ == "__main__":
    sys.exit(main())
