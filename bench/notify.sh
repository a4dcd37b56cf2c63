#!/usr/bin/env bash
# ./tessel bench notify: how fast the engine sends notifications, and what receivers take of them.
# tessel_notify_load starts the engine in-process with BENCH_NOTIFY_DEVICES agents (as the host
# does, with the in-memory host) and asks it for v2c linkDown traps through the operation behind
# the host's sendNotification, from the first device alone and round robin over all of them, to
#   - tessel_trap_sink, a receiver that only counts (recvmmsg, one thread), and checks that each
#     notification came from its device's address and SNMP port, and
#   - net-snmp's snmptrapd with a configuration of its own, logging each trap as one line to a
#     file; what it logged is what it received.
# Beside them, net-snmp's snmptrap in a loop (one process per trap) to the same counting sink.
# Then informs with BENCH_NOTIFY_OUTSTANDING outstanding, acknowledged by the sink, from one
# device and from all: acknowledged/s, and whether every inform was acknowledged exactly once.
# The receivers run on CPU BENCH_NOTIFY_RECEIVER_CPU, the engine (sender and service threads) on
# BENCH_NOTIFY_ENGINE_CPU; snmptrap runs there too. Prints one table.
#
# Environment (defaults in brackets):
#   BENCH_NOTIFY_DURATION [10]  seconds of sending per row (also ended by BENCH_NOTIFY_COUNT
#     [1000000] notifications)
#   BENCH_NOTIFY_DEVICES [10000]  agents, from BENCH_NOTIFY_ADDRESS [127.0.1.1] on port
#     BENCH_NOTIFY_PORT [11241] (the engine also binds that port + 1 on every address)
#   BENCH_NOTIFY_OUTSTANDING [1000]  informs outstanding; BENCH_NOTIFY_INFORM_TIMEOUT [5] seconds
#   BENCH_NOTIFY_SNMPTRAP_COUNT [200]  snmptrap processes, within BENCH_NOTIFY_SNMPTRAP_SECONDS [30]
#   BENCH_NOTIFY_SINK_PORT [11251]  BENCH_NOTIFY_SNMPTRAPD_PORT [11252]  on 127.0.0.1
#   BENCH_NOTIFY_RECEIVER_CPU [0]  BENCH_NOTIFY_ENGINE_CPU [1]
#   BENCH_SKIP [""]  any of "snmptrapd snmptrap informs" to leave out
set -euo pipefail

LOG_TAG="bench notify"
# shellcheck source=bench/lib.sh
. "$(dirname "${BASH_SOURCE[0]}")/lib.sh"

DURATION=${BENCH_NOTIFY_DURATION:-10}
COUNT=${BENCH_NOTIFY_COUNT:-1000000}
DEVICES=${BENCH_NOTIFY_DEVICES:-10000}
ADDRESS=${BENCH_NOTIFY_ADDRESS:-127.0.1.1}
PORT=${BENCH_NOTIFY_PORT:-11241}
OUTSTANDING=${BENCH_NOTIFY_OUTSTANDING:-1000}
INFORM_TIMEOUT=${BENCH_NOTIFY_INFORM_TIMEOUT:-5}
SNMPTRAP_COUNT=${BENCH_NOTIFY_SNMPTRAP_COUNT:-200}
SNMPTRAP_SECONDS=${BENCH_NOTIFY_SNMPTRAP_SECONDS:-30}
SINK_PORT=${BENCH_NOTIFY_SINK_PORT:-11251}
SNMPTRAPD_PORT=${BENCH_NOTIFY_SNMPTRAPD_PORT:-11252}
RECEIVER_CPU=${BENCH_NOTIFY_RECEIVER_CPU:-0}
ENGINE_CPU=${BENCH_NOTIFY_ENGINE_CPU:-1}
SKIP=${BENCH_SKIP:-}
SINK=$BUILD/bench/tessel_trap_sink
NOTIFY_LOAD=$BUILD/bench/tessel_notify_load
SNMPTRAPD=/usr/sbin/snmptrapd
SNMPTRAP=/usr/bin/snmptrap
LINKDOWN=(1.3.6.1.6.3.1.1.5.3 1.3.6.1.2.1.2.2.1.1.2 i 2 1.3.6.1.2.1.2.2.1.7.2 i 1
  1.3.6.1.2.1.2.2.1.8.2 i 2)
SERVER_PIN=(taskset -c "$RECEIVER_CPU")

ROWS=()   # table lines, in the order measured
NOTES=()

skipped() { [[ " $SKIP " == *" $1 "* ]]; }

# senders_text SENDERS [FIRST]: the table's name for the devices that send.
senders_text() {
  if [ "${2:-0}" != 0 ]; then
    echo "device $(($2 + 1))"
  elif [ "$1" = 1 ]; then
    echo "1 device"
  else
    echo "$1 devices"
  fi
}

# wait_for_file_line FILE PATTERN SECONDS PID: true once FILE has a line matching PATTERN, false
# when PID has ended first. The process itself is asked, not its group: a server just started may
# not have made its group yet.
wait_for_file_line() {
  local deadline=$((SECONDS + $3))
  until grep -q "$2" "$1" 2>/dev/null; do
    kill -0 "$4" 2>/dev/null || return 1
    [ "$SECONDS" -lt "$deadline" ] || return 1
    sleep 0.05
  done
}

# start_sink [OPTIONS...]: the counting sink, stopping by itself two seconds after the last
# datagram; sets SINK_GROUP.
start_sink() {
  : >"$WORK/sink.log"
  start_server sink "$SINK" --address 127.0.0.1 --port "$SINK_PORT" --idle 2 \
    --duration $((DURATION + SNMPTRAP_SECONDS + 60)) "$@"
  SINK_GROUP=$SERVER_GROUP
  wait_for_file_line "$WORK/sink.log" '^READY' 10 "$SINK_GROUP" || { log "the sink did not start"; exit 1; }
}

# finish_sink: waits (bounded) until the sink has stopped by itself; sets SINK_RESULT.
finish_sink() {
  local strangers
  wait_for_file_line "$WORK/sink.log" '^SINK ' 30 "$SINK_GROUP" || true
  finish_server "$SINK_GROUP"
  SINK_RESULT=$(grep '^SINK ' "$WORK/sink.log" || true)
  strangers=$(field "$SINK_RESULT" wrong_source)
  if [ -n "$strangers" ] && [ "$strangers" != 0 ]; then
    NOTES+=("$strangers notifications reached the sink from another address or port than their device's")
  fi
}

# Every notification of the engine must come from its device's address and SNMP port.
from_devices() { echo --senders "$ADDRESS+$DEVICES" --sender-port "$PORT"; }

# load SENDERS FIRST [OPTIONS...]: runs the engine's notification load, SENDERS devices from
# device FIRST (0-based) on sending; sets LOAD_RESULT.
load() {
  local senders=$1 first=$2
  shift 2
  interruptibly "$WORK/load.out" taskset -c "$ENGINE_CPU" "$NOTIFY_LOAD" --devices "$DEVICES" \
    --address "$ADDRESS" --port "$PORT" --senders "$senders" --first-sender "$first" \
    --duration "$DURATION" --count "$COUNT" "$@"
  LOAD_RESULT=$(grep '^RESULT' "$WORK/load.out" || true)
  [ -n "$LOAD_RESULT" ] || NOTES+=("$(senders_text "$senders" "$first"): the load printed no result")
  local failed
  failed=$(field "$LOAD_RESULT" not_sent)
  if [ -n "$failed" ] && [ "$failed" != 0 ]; then
    NOTES+=("$(senders_text "$senders" "$first"): the engine did not send $failed notifications")
  fi
}

# trap_row RECEIVER SENDERS_TEXT RECEIVED RECEIVED_PER_S: a table line for the trap load just
# measured.
trap_row() {
  local sent rate
  sent=$(field "$LOAD_RESULT" sent)
  rate=$(field "$LOAD_RESULT" rate)
  ROWS+=("$(printf '%-16s %-15s %10s %11s %9s %9s %8s' "$1" "$2" "${rate:--}" "$4" "${sent:--}" \
    "$3" "$(lost "$sent" "$3")")")
  log "${ROWS[-1]}"
}

lost() { if [ -n "$1" ] && [ -n "$2" ] && [ "$2" != - ]; then echo $(($1 - $2)); else echo -; fi; }

# per_second COUNT SECONDS
per_second() {
  if [ -n "$1" ] && [ -n "$2" ] && [ "$1" != - ]; then
    awk -v n="$1" -v s="$2" 'BEGIN { if (s > 0) printf "%.0f", n / s; else print "-" }'
  else
    echo -
  fi
}

# traps_to_sink SENDERS [FIRST]
traps_to_sink() {
  local senders=$1 first=${2:-0}
  # shellcheck disable=SC2046  # from_devices gives four words on purpose
  start_sink $(from_devices)
  load "$senders" "$first" --to "127.0.0.1:$SINK_PORT"
  finish_sink
  trap_row tessel_trap_sink "$(senders_text "$senders" "$first")" \
    "$(field "$SINK_RESULT" received)" "$(field "$SINK_RESULT" rate)"
}

# snmptrapd logs one line per notification, and nothing else with that mark.
start_snmptrapd() {
  mkdir -p "$WORK/snmptrapd"
  printf 'disableAuthorization yes\n' >"$WORK/snmptrapd/snmptrapd.conf"
  : >"$WORK/snmptrapd/traps.log"
  start_server snmptrapd env SNMP_PERSISTENT_DIR="$WORK/snmptrapd" MIBS= "$SNMPTRAPD" -f -n -C \
    -c "$WORK/snmptrapd/snmptrapd.conf" -Lf "$WORK/snmptrapd/traps.log" -F 'NOTIFY\n' \
    "udp:127.0.0.1:$SNMPTRAPD_PORT"
  SNMPTRAPD_GROUP=$SERVER_GROUP
  wait_for_file_line "$WORK/snmptrapd/traps.log" 'NET-SNMP version' 10 "$SNMPTRAPD_GROUP" && return 0
  NOTES+=("snmptrapd did not start: $(cat "$WORK/snmptrapd.log" "$WORK/snmptrapd/traps.log")")
  log "${NOTES[-1]}"
  finish_server "$SNMPTRAPD_GROUP"
  return 1
}

logged() { grep -c '^NOTIFY' "$WORK/snmptrapd/traps.log" || true; }

# finish_snmptrapd: once its log has stopped growing for a second (within 30 s), stops it; sets
# LOGGED and LOGGED_SECONDS (from the load's start until the last line was logged).
finish_snmptrapd() {
  local before=-1 now deadline=$((SECONDS + 30))
  now=$(logged)
  while [ "$now" != "$before" ] && [ "$SECONDS" -lt "$deadline" ]; do
    before=$now
    pause 1
    now=$(logged)
  done
  LOGGED_SECONDS=$(awk -v from="$LOAD_STARTED" -v to="$(stat -c %.3Y "$WORK/snmptrapd/traps.log")" \
    'BEGIN { printf "%.3f", to - from }')
  finish_server "$SNMPTRAPD_GROUP"
  LOGGED=$(logged)
}

traps_to_snmptrapd() {
  local senders=$1 start_s
  start_snmptrapd || return 0
  LOAD_STARTED=$EPOCHREALTIME
  load "$senders" 0 --to "127.0.0.1:$SNMPTRAPD_PORT"
  # The load starts the engine before it sends: count from the first send.
  start_s=$(field "$LOAD_RESULT" start_s)
  LOAD_STARTED=$(awk -v a="$LOAD_STARTED" -v b="${start_s:-0}" 'BEGIN { printf "%.6f", a + b }')
  finish_snmptrapd
  trap_row snmptrapd "$(senders_text "$senders")" "$LOGGED" \
    "$(per_second "$LOGGED" "$LOGGED_SECONDS")"
}

# snmptrap_loop: one snmptrap process per trap, one after another, to the counting sink.
snmptrap_loop() {
  local start sent=0 seconds deadline=$((SECONDS + SNMPTRAP_SECONDS))
  start_sink
  start=$EPOCHREALTIME
  while [ "$sent" -lt "$SNMPTRAP_COUNT" ] && [ "$SECONDS" -lt "$deadline" ]; do
    taskset -c "$ENGINE_CPU" "$SNMPTRAP" -v2c -c public "127.0.0.1:$SINK_PORT" '' "${LINKDOWN[@]}" ||
      { NOTES+=("snmptrap failed"); break; }
    sent=$((sent + 1))
  done
  seconds=$(elapsed "$start")
  finish_sink
  LOAD_RESULT="RESULT sent=$sent rate=$(per_second "$sent" "$seconds")"
  ROWS+=("$(printf '%-16s %-15s %10s %11s %9s %9s %8s' tessel_trap_sink "snmptrap loop" \
    "$(field "$LOAD_RESULT" rate)" - "$sent" "$(field "$SINK_RESULT" received)" \
    "$(lost "$sent" "$(field "$SINK_RESULT" received)")")")
  log "${ROWS[-1]}"
  SNMPTRAP_RATE=$(field "$LOAD_RESULT" rate)
}

INFORM_ROWS=()
informs_to_sink() {
  local senders=$1 check
  # shellcheck disable=SC2046
  start_sink --answer-informs $(from_devices)
  load "$senders" 0 --to "127.0.0.1:$SINK_PORT" --informs --outstanding "$OUTSTANDING" \
    --timeout "$INFORM_TIMEOUT"
  finish_sink
  check=$([ "$(field "$LOAD_RESULT" clean)" = yes ] && echo "exactly once" || echo FAILED)
  INFORM_ROWS+=("$(printf '%-15s %10s %9s %11s %9s %9s %9s  %s' "$(senders_text "$senders")" \
    "$(field "$LOAD_RESULT" rate)" "$(field "$LOAD_RESULT" sent)" \
    "$(field "$LOAD_RESULT" acknowledged)" "$(field "$LOAD_RESULT" duplicates)" \
    "$(field "$LOAD_RESULT" dropped)" "$(field "$LOAD_RESULT" unanswered)" "$check")")
  log "${INFORM_ROWS[-1]}"
  if [ "$check" = FAILED ]; then
    NOTES+=("informs from $(senders_text "$senders"): $LOAD_RESULT; the sink: $SINK_RESULT")
  fi
}

build_notify_tools() {
  if [ ! -f "$BUILD/build.ninja" ]; then
    cmake -S "$ROOT" -B "$BUILD" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
  fi
  log "building the trap sink and the notification load"
  cmake --build "$BUILD" --target tessel_trap_sink tessel_notify_load -- -j2 >/dev/null
}

print_table() {
  local one spread
  printf '\n%-16s %-15s %10s %11s %9s %9s %8s\n' receiver senders sent/s received/s sent \
    received lost
  printf '%s\n' "${ROWS[@]}"
  if [ "${#INFORM_ROWS[@]}" -gt 0 ]; then
    printf '\ninforms, %s outstanding, acknowledged by tessel_trap_sink\n' "$OUTSTANDING"
    printf '%-15s %10s %9s %11s %9s %9s %9s  %s\n' senders acked/s sent acknowledged twice \
      dropped pending "each inform"
    printf '%s\n' "${INFORM_ROWS[@]}"
  fi
  one=$(sed -nE 's/^tessel_trap_sink +1 device +([0-9]+) .*/\1/p' <<<"$(printf '%s\n' "${ROWS[@]}")")
  spread=$(sed -nE "s/^tessel_trap_sink +$DEVICES devices +([0-9]+) .*/\1/p" \
    <<<"$(printf '%s\n' "${ROWS[@]}")")
  printf '\ntarget: 50000 v2c traps/s to the counting sink: from 1 device %s, from %s devices %s\n' \
    "${one:--}" "$DEVICES" "${spread:--}"
  if [ -n "${SNMPTRAP_RATE:-}" ] && [ -n "$one" ]; then
    printf 'snmptrap: one process per trap sends %s/s; the engine from 1 device %s times that\n' \
      "$SNMPTRAP_RATE" "$(ratio "$one" "$SNMPTRAP_RATE")"
  fi
  printf 'machine: %s CPUs; receivers on CPU %s, the engine on CPU %s; load average %s before, %s after\n' \
    "$(nproc)" "$RECEIVER_CPU" "$ENGINE_CPU" "$LOAD_BEFORE" "$(cut -d' ' -f1-3 /proc/loadavg)"
  local note
  for note in "${NOTES[@]+"${NOTES[@]}"}"; do printf 'note: %s\n' "$note"; done
}

build_notify_tools
skipped snmptrapd || ensure_package snmptrapd "$SNMPTRAPD" || SKIP+=" snmptrapd"
skipped snmptrap || ensure_package snmp "$SNMPTRAP" || SKIP+=" snmptrap"
LOAD_BEFORE=$(cut -d' ' -f1-3 /proc/loadavg)

traps_to_sink 1
# The last device registered: what finding a device among many costs a notification.
[ "$DEVICES" -gt 1 ] && traps_to_sink 1 $((DEVICES - 1))
traps_to_sink "$DEVICES"
if ! skipped snmptrapd; then
  traps_to_snmptrapd 1
  traps_to_snmptrapd "$DEVICES"
fi
skipped snmptrap || snmptrap_loop
if ! skipped informs; then
  informs_to_sink 1
  informs_to_sink "$DEVICES"
fi
print_table
