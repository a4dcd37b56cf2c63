#!/usr/bin/env bash
# Seconds to add and remove 10,000 and 50,000 device addresses on a veth inside a network namespace
# of its own: through the engine's rtnetlink batches, and through `ip -batch` files of 2,000
# `addr add` (then `addr del`) lines in the same namespace. Needs root. Counts: BENCH_VIP_COUNTS.
set -euo pipefail
export LC_NUMERIC=C
ROOT=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)
BUILD=${TESSEL_BUILD:-$ROOT/build}
COUNTS=${BENCH_VIP_COUNTS:-10000 50000}
NS=tessel-vipbench-$$
WORK=$(mktemp -d /tmp/tessel-vipbench.XXXXXX)
cleanup() { ip netns del "$NS" 2>/dev/null || true; rm -rf "$WORK"; }
trap cleanup EXIT
trap 'exit 130' INT TERM

[ "$(id -u)" -eq 0 ] || { echo "vip: needs root (network namespaces)" >&2; exit 2; }
cmake --build "$BUILD" --target tessel_vip_bench -- -j2 >/dev/null
ip netns add "$NS"
ip -n "$NS" link add tv0 type veth peer name tv1
ip -n "$NS" link set tv0 up
ip -n "$NS" link set tv1 up

elapsed() { awk -v from="$1" -v to="$EPOCHREALTIME" 'BEGIN { printf "%.2f", to - from }'; }

# ip_batches VERB COUNT FAMILY: runs `ip -batch` over files of 2,000 lines; prints the seconds.
ip_batches() {
  local verb=$1 count=$2 family=$3 start
  rm -f "$WORK"/batch.*
  awk -v n="$count" -v verb="$verb" -v family="$family" 'BEGIN {
    for (i = 0; i < n; i++) {
      if (family == 6) line = sprintf("addr %s fd00:%x::%x/128 dev tv0%s", verb, 1 + int(i / 60000), 1 + i % 60000, verb == "add" ? " nodad" : "")
      else line = sprintf("addr %s 10.%d.%d.%d/32 dev tv0", verb, 1 + int(i / 62500), int(i % 62500 / 250), 1 + i % 250)
      print line > sprintf("'"$WORK"'/batch.%06d", int(i / 2000))
    }
  }'
  start=$EPOCHREALTIME
  for file in "$WORK"/batch.*; do ip -n "$NS" -batch "$file"; done
  elapsed "$start"
}

printf '%-6s %8s %12s %12s %12s %12s %8s\n' family count netlink-add netlink-del ip-add ip-del add-x
for count in $COUNTS; do
  for family in 4 6; do
    line=$("$BUILD/bench/tessel_vip_bench" "$NS" tv0 "$count" "$family")
    add=$(sed -E 's/.*added [0-9]+ in ([0-9.]+) s.*/\1/' <<<"$line")
    del=$(sed -E 's/.*removed [0-9]+ in ([0-9.]+) s.*/\1/' <<<"$line")
    ipadd=$(ip_batches add "$count" "$family")
    ipdel=$(ip_batches del "$count" "$family")
    ratio=$(awk -v a="$ipadd" -v b="$add" 'BEGIN { printf "%.1f", a / (b > 0 ? b : 0.001) }')
    printf 'IPv%-4s %8d %12s %12s %12s %12s %8s\n' "$family" "$count" "$add" "$del" "$ipadd" "$ipdel" "$ratio"
  done
done
echo "target: 50,000 added by netlink in under 5 s, at least 10x faster than the ip batches (add-x)"
