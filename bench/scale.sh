#!/usr/bin/env bash
# ./tessel bench scale: Tessel with many agents, started by the launcher as users start it
# (./tessel run --devices N --address A --snmp-port P, built beforehand). For a small and a large
# instance it measures the seconds from launch until the last agent answers a Get, the resident
# memory of the server's process group at that moment (and from the two instances the memory each
# further agent costs), how many randomly chosen agents answer a Get, for the large instance the
# CPU it uses idle, and the seconds from SIGTERM until its whole process group has gone. Then the
# same for snmpsim with as many UDP endpoints, for comparison. Prints one table.
#
# Environment (defaults in brackets):
#   BENCH_SCALE_DEVICES [50000]  agents of the large instance, fewer when one descriptor per agent
#     plus BENCH_FD_RESERVE [300] (the JVM's own) exceeds a hard open-file limit that cannot be raised
#   BENCH_SCALE_SMALL [1000]  agents of the small instance
#   BENCH_SCALE_SAMPLE [1000]  agents chosen at random, each sent one Get (within
#     BENCH_SCALE_SAMPLE_SECONDS [30] at most)
#   BENCH_IDLE_SECONDS [60]  idle CPU measured over this long, BENCH_IDLE_SETTLE [2] s after the Gets
#   BENCH_SCALE_ADDRESS [127.1.0.1]  BENCH_SCALE_PORT [11191]
#   BENCH_SCALE_START_TIMEOUT [120]  seconds for the last agent to answer
#   BENCH_STOP_TIMEOUT [30]  seconds from SIGTERM before the group is killed
#   BENCH_SKIP [""]  "tessel" or "snmpsim" to leave out
#   BENCH_SCALE_SNMPSIM_DEVICES [10000]  endpoints of the large snmpsim
#   BENCH_SCALE_SNMPSIM_ADDRESS [127.3.0.1]
set -euo pipefail

LOG_TAG="bench scale"
BENCH_STOP_TIMEOUT=${BENCH_STOP_TIMEOUT:-30}
# shellcheck source=bench/lib.sh
. "$(dirname "${BASH_SOURCE[0]}")/lib.sh"

DEVICES=${BENCH_SCALE_DEVICES:-50000}
SMALL=${BENCH_SCALE_SMALL:-1000}
SAMPLE=${BENCH_SCALE_SAMPLE:-1000}
SAMPLE_SECONDS=${BENCH_SCALE_SAMPLE_SECONDS:-30}
IDLE_SECONDS=${BENCH_IDLE_SECONDS:-60}
IDLE_SETTLE=${BENCH_IDLE_SETTLE:-2}
RESERVE=${BENCH_FD_RESERVE:-300}
TESSEL_ADDRESS=${BENCH_SCALE_ADDRESS:-127.1.0.1}
PORT=${BENCH_SCALE_PORT:-11191}
START_TIMEOUT=${BENCH_SCALE_START_TIMEOUT:-120}
SKIP=${BENCH_SKIP:-}
SNMPSIM_DEVICES=${BENCH_SCALE_SNMPSIM_DEVICES:-10000}
SNMPSIM_ADDRESS=${BENCH_SCALE_SNMPSIM_ADDRESS:-127.3.0.1}
TICKS=$(getconf CLK_TCK)

declare -A FIGURE=()  # "server agents key" -> figure
ROWS=()               # "server agents" in the order measured
NOTES=()

# fitting_devices WANTED: sets FITTING to WANTED, or to as many agents as the hard open-file
# limit allows when it is too low for WANTED and cannot be raised from here (Tessel raises its own
# limit as far as it may), with a note saying so.
fitting_devices() {
  local wanted=$1 hard
  hard=$(ulimit -Hn)
  FITTING=$wanted
  if [ "$hard" = unlimited ] || [ $((wanted + RESERVE)) -le "$hard" ] ||
      (ulimit -Hn $((wanted + RESERVE))) 2>/dev/null; then
    return 0
  fi
  FITTING=$((hard - RESERVE))
  NOTES+=("$wanted agents need $((wanted + RESERVE)) descriptors (one socket each, $RESERVE for the JVM), but the hard open-file limit is $hard and this process may not raise it (that needs CAP_SYS_RESOURCE): measured $FITTING")
  log "${NOTES[-1]}"
}

# group_usage PGID: "RSS_KIB CPU_TICKS PROCESSES" summed over the processes of the group.
group_usage() {
  local group=$1 dir stat fields rss=0 ticks=0 processes=0 key value
  for dir in /proc/[0-9]*; do
    { read -r stat <"$dir/stat"; } 2>/dev/null || continue
    read -r -a fields <<<"${stat##*) }"  # after the command name: state ppid pgrp ...
    [ "${fields[2]}" = "$group" ] || continue
    ticks=$((ticks + fields[11] + fields[12]))  # utime + stime, all threads
    processes=$((processes + 1))
    while read -r key value _; do
      [ "$key" = VmRSS: ] && rss=$((rss + value))
    done 2>/dev/null <"$dir/status" || true
  done
  echo "$rss $ticks $processes"
}

start_tessel() {  # start_tessel AGENTS
  start_server "tessel-$1" "$ROOT/tessel" run --devices "$1" --address "$TESSEL_ADDRESS" --snmp-port "$PORT"
}

# start_snmpsim AGENTS: snmpsimd with one UDP endpoint per agent, all serving the same small system
# group; its soft descriptor limit raised to the hard one, which it does not do itself.
start_snmpsim() {
  local agents=$1 dir=$WORK/snmpsim-$1 user=()
  mkdir -p "$dir/data" "$dir/cache"
  chmod 755 "$dir" "$dir/data"
  chmod 777 "$dir/cache"
  printf '%s\n' '1.3.6.1.2.1.1.1.0|4|scale benchmark agent' '1.3.6.1.2.1.1.2.0|6|1.3.6.1.4.1.8072.3.2.10' \
    '1.3.6.1.2.1.1.3.0|67|100' '1.3.6.1.2.1.1.5.0|4|agent' >"$dir/data/public.snmprec"
  seq 0 $((agents - 1)) | offset_addresses "$SNMPSIM_ADDRESS" |
    sed "s/.*/--agent-udpv4-endpoint=&:$PORT/" >"$dir/endpoints"
  chmod 644 "$dir/endpoints" "$dir/data/public.snmprec"
  [ "$(id -u)" -eq 0 ] && user=(--process-user=nobody --process-group=nogroup)
  start_server "snmpsim-$agents" prlimit --nofile="$(ulimit -Hn)" snmpsimd --data-dir="$dir/data" \
    --cache-dir="$dir/cache" --args-from-file="$dir/endpoints" "${user[@]}"
}

# measure_instance SERVER FIRST AGENTS IDLE: launches SERVER with AGENTS agents from address FIRST
# and records its figures; the idle CPU only when IDLE is "idle".
measure_instance() {
  local server=$1 first=$2 agents=$3 idle=$4 launched group last key
  key="$server $agents"
  ROWS+=("$key")
  last=$(address_plus "$first" $((agents - 1)))
  log "$server with $agents agents ($first to $last, port $PORT)"
  launched=$EPOCHREALTIME
  "start_$server" "$agents"
  group=$SERVER_GROUP
  if ! wait_for_answer "$last" "$PORT" "$START_TIMEOUT" "$group"; then
    log "$server did not answer on $last within $START_TIMEOUT s; its log:"
    tail -n 20 "$WORK/$server-$agents.log" >&2
    FIGURE["$key start"]="no answer"
    finish_server "$group"
    return 0
  fi
  FIGURE["$key start"]=$(elapsed "$launched")
  local rss ticks processes
  read -r rss ticks processes <<<"$(group_usage "$group")"
  FIGURE["$key rss"]=$rss
  log "$server: last agent answered after ${FIGURE["$key start"]} s; RSS $rss KiB over $processes process(es)"
  sample "$key" "$first" "$agents"
  if [ "$idle" = idle ]; then idle_cpu "$key" "$group"; fi
  finish_server "$group"
  FIGURE["$key stop"]=$STOPPED_IN
  FIGURE["$key left"]=$(leftovers "$group" "$first" "$agents")
}

# sample KEY FIRST AGENTS: one Get to each of SAMPLE agents chosen at random (64 outstanding, a
# time-out of 1 s each, SAMPLE_SECONDS at most); records how many answered.
sample() {
  local key=$1 count=$SAMPLE line answered targets
  [ "$count" -le "$3" ] || count=$3
  targets=$(shuf -i "0-$(($3 - 1))" -n "$count" | offset_addresses "$2" | paste -sd,)
  interruptibly "$WORK/sample" "$LOADGEN" --targets "$targets" --port "$PORT" \
    --get 1.3.6.1.2.1.1.5.0 --requests "$count" --window 64 --warmup 0 --duration "$SAMPLE_SECONDS" --quiet
  line=$(grep '^RESULT' "$WORK/sample" || true)
  log "${key% *} random agents: ${line:-no result}"
  answered=$(field "$line" targets_answered)
  FIGURE["$key answered"]="${answered:-"-"}/$count"
}

# idle_cpu KEY GROUP: the group's CPU time over IDLE_SECONDS without traffic, in % of one core.
idle_cpu() {
  local key=$1 group=$2 rss before after processes from
  pause "$IDLE_SETTLE"
  read -r rss before processes <<<"$(group_usage "$group")"
  from=$EPOCHREALTIME
  pause "$IDLE_SECONDS"
  read -r rss after processes <<<"$(group_usage "$group")"
  FIGURE["$key idle"]=$(awk -v t=$((after - before)) -v hz="$TICKS" -v s="$(elapsed "$from")" \
    'BEGIN { printf "%.2f", 100 * t / hz / s }')
  log "${key% *} idle: ${FIGURE["$key idle"]} % of a core over $IDLE_SECONDS s"
}

# leftovers GROUP FIRST AGENTS: "none" when no process of the group and no UDP socket on an
# address of its agents remain.
leftovers() {
  local processes sockets
  read -r _ _ processes <<<"$(group_usage "$1")"
  sockets=$(ss -Huan "sport = :$PORT" | awk '{ print $4 }' |
    grep -cxFf <(seq 0 $(($3 - 1)) | offset_addresses "$2" | sed "s/$/:$PORT/") || true)
  if [ "$processes" -eq 0 ] && [ "$sockets" -eq 0 ]; then
    echo none
  else
    echo "$processes proc, $sockets sock"
  fi
}

# figure KEY NAME: a recorded figure, or "-".
figure() { echo "${FIGURE["$1 $2"]:-"-"}"; }

# marginal SERVER: KiB per agent between the server's small and large instance, or "-".
marginal() {
  local small=${FIGURE["$1 $SMALL rss"]:-} large=${FIGURE["$1 $2 rss"]:-}
  if [ -n "$small" ] && [ -n "$large" ] && [ "$2" -gt "$SMALL" ]; then
    awk -v a="$small" -v b="$large" -v n=$(($2 - SMALL)) 'BEGIN { printf "%.2f", (b - a) / n }'
  else
    echo -
  fi
}

print_table() {
  local format='%-8s %7s %8s %8s %10s %10s %7s %7s %13s\n' row server agents rss
  # shellcheck disable=SC2059  # the format is a constant
  printf "\n$format" server agents 'start s' 'RSS MiB' 'KiB/agent' answered 'idle %' 'stop s' 'left after'
  for row in "${ROWS[@]}"; do
    read -r server agents <<<"$row"
    rss=$(figure "$row" rss)
    [ "$rss" = - ] || rss=$(awk -v k="$rss" 'BEGIN { printf "%.1f", k / 1024 }')
    # shellcheck disable=SC2059
    printf "$format" "$server" "$agents" "$(figure "$row" start)" "$rss" "$(marginal "$server" "$agents")" \
      "$(figure "$row" answered)" "$(figure "$row" idle)" "$(figure "$row" stop)" "$(figure "$row" left)"
  done
  printf '\nstart: launch to the first answer of the last agent. RSS: VmRSS summed over the process\n'
  printf 'group then. KiB/agent: (RSS - RSS with %s agents) / (agents - %s). answered: of agents chosen\n' \
    "$SMALL" "$SMALL"
  printf 'at random, those that answered the one Get each was sent. idle: CPU of the group over %s s\n' \
    "$IDLE_SECONDS"
  printf 'without traffic, %% of one core. stop: SIGTERM to the exit of the whole group. left after: its\n'
  printf 'processes and the sockets of its agents then.\n'
  printf 'targets (50000 agents): start <= 10 s, <= 2 KiB/agent, 1000/1000 answered, idle < 0.5 %%, stop <= 5 s\n'
  local note
  for note in "${NOTES[@]+"${NOTES[@]}"}"; do printf 'note: %s\n' "$note"; done
}

main() {
  [ "$DEVICES" -gt "$SMALL" ] || { log "BENCH_SCALE_DEVICES must be above $SMALL"; exit 2; }
  build_tools
  if [[ " $SKIP " != *" tessel "* ]] && build_tessel; then
    fitting_devices "$DEVICES"
    measure_instance tessel "$TESSEL_ADDRESS" "$SMALL" busy
    measure_instance tessel "$TESSEL_ADDRESS" "$FITTING" idle
  fi
  if [[ " $SKIP " != *" snmpsim "* ]] && ensure_package snmpsim /usr/bin/snmpsimd; then
    fitting_devices "$SNMPSIM_DEVICES"
    measure_instance snmpsim "$SNMPSIM_ADDRESS" "$SMALL" busy
    measure_instance snmpsim "$SNMPSIM_ADDRESS" "$FITTING" idle
  fi
  print_table
}

main "$@"
