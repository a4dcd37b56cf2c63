#!/usr/bin/env bash
# ./tessel bench: the same SNMP workloads, in one run, against Tessel, net-snmp snmpd, snmpsim
# (serving a recording of that snmpd) and a UDP echo server (the machine's ceiling), all on
# loopback, the server pinned to one CPU and the load generator to another. Prints one table of
# responses/s, ratios and latency. The SNMPv3 workload (authPriv, SHA + AES) runs against Tessel
# and snmpd, both given the same user.
#
# Environment (defaults in brackets):
#   BENCH_WARMUP [3]  BENCH_DURATION [10]  seconds of warm-up and of measurement per figure
#   BENCH_WINDOW [64]  outstanding requests       BENCH_DEVICES [100]  Tessel agents
#   BENCH_SERVER_CPU [0]  BENCH_LOADGEN_CPU [1]
#   BENCH_SNMPD_PORT [11161]  BENCH_TESSEL_PORT [11171]  BENCH_SNMPSIM_PORT [11181]
#   BENCH_ECHO_PORT [12000]
#   BENCH_TESSEL_ADDRESS [127.0.1.1]  BENCH_TESSEL_START_TIMEOUT [300] seconds
#   BENCH_SKIP [""]  any of "tessel snmpd snmpsim echo" to leave out (snmpsim needs snmpd)
#   BENCH_WORKLOADS ["get getnext getbulk get-v3"]  the workloads to run
#   BENCH_V3_USER  BENCH_V3_AUTH  BENCH_V3_PRIV  the SNMPv3 user (SHA, AES) and its passwords
#     [the first such user of profiles/snmpv3.conf, Tessel's default; without one: bench,
#     shapassword, aespassword, given to Tessel with --snmpv3]
set -euo pipefail

ROOT=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)
BUILD=${TESSEL_BUILD:-$ROOT/build}
WARMUP=${BENCH_WARMUP:-3}
DURATION=${BENCH_DURATION:-10}
WINDOW=${BENCH_WINDOW:-64}
DEVICES=${BENCH_DEVICES:-100}
SERVER_CPU=${BENCH_SERVER_CPU:-0}
LOADGEN_CPU=${BENCH_LOADGEN_CPU:-1}
SNMPD_PORT=${BENCH_SNMPD_PORT:-11161}
TESSEL_PORT=${BENCH_TESSEL_PORT:-11171}
ECHO_PORT=${BENCH_ECHO_PORT:-12000}
SNMPSIM_PORT=${BENCH_SNMPSIM_PORT:-11181}
TESSEL_ADDRESS=${BENCH_TESSEL_ADDRESS:-127.0.1.1}
TESSEL_START_TIMEOUT=${BENCH_TESSEL_START_TIMEOUT:-300}
SKIP=${BENCH_SKIP:-}

LOADGEN=$BUILD/bench/tessel_loadgen
ECHO=$BUILD/bench/tessel_echo
read -r -a WORKLOADS <<<"${BENCH_WORKLOADS:-get getnext getbulk get-v3}"
declare -A REQUEST=(
  [get]="--get 1.3.6.1.2.1.1.5.0"
  [getnext]="--getnext 1.3.6.1.2.1.1"
  [getbulk]="--getbulk 1.3.6.1.2.1.2.2 --non-repeaters 0 --max-repetitions 10"
)
declare -A RESULT=()  # "server workload" -> RESULT line of the load generator
declare -a SERVER_GROUPS=()
WORK=$(mktemp -d /tmp/tessel-bench.XXXXXX)
chmod 711 "$WORK"  # servers that drop to nobody reach their own subdirectories

log() { printf 'bench: %s\n' "$*" >&2; }
skipped() { [[ " $SKIP " == *" $1 "* ]]; }

# Stops the load generator and every server this script started (each server leads its own
# process group) and removes the temporary directory.
LOADGEN_PID=
cleanup() {
  local group
  [ -n "$LOADGEN_PID" ] && kill -TERM "$LOADGEN_PID" 2>/dev/null
  for group in "${SERVER_GROUPS[@]}"; do stop_group "$group"; done
  rm -rf "$WORK"
}
trap cleanup EXIT
trap 'exit 130' INT TERM

# stop_group PGID: SIGTERM, then SIGKILL after 10 s for whatever is left of the group.
stop_group() {
  local group=$1 i
  kill -TERM -- "-$group" 2>/dev/null || return 0
  for ((i = 0; i < 100; i++)); do
    kill -0 -- "-$group" 2>/dev/null || return 0
    sleep 0.1
  done
  log "process group $group ignored SIGTERM for 10 s; killing it"
  kill -KILL -- "-$group" 2>/dev/null || true
}

# start_server NAME COMMAND...: runs COMMAND pinned to the server CPU in a new process group;
# sets SERVER_GROUP.
start_server() {
  local name=$1; shift
  setsid taskset -c "$SERVER_CPU" "$@" >"$WORK/$name.log" 2>&1 </dev/null &
  SERVER_GROUP=$!
  SERVER_GROUPS+=("$SERVER_GROUP")
}

finish_server() {
  stop_group "$1"
  local kept=() group
  for group in "${SERVER_GROUPS[@]}"; do [ "$group" = "$1" ] || kept+=("$group"); done
  SERVER_GROUPS=("${kept[@]+"${kept[@]}"}")
}

# wait_for_answer TARGETS PORT SECONDS GROUP [LOADGEN OPTIONS...]: true once a Get is answered
# by every address given (comma list), false on time-out or when the server's group has gone.
wait_for_answer() {
  local targets=$1 port=$2 seconds=$3 group=$4 deadline target
  shift 4
  deadline=$((SECONDS + seconds))
  for target in ${targets//,/ }; do
    until "$LOADGEN" --targets "$target" --port "$port" --get 1.3.6.1.2.1.1.5.0 --window 1 --warmup 0 \
        --duration 1 --timeout-ms 200 --until-answer --quiet "$@" >/dev/null 2>&1; do
      kill -0 -- "-$group" 2>/dev/null || return 1
      [ "$SECONDS" -lt "$deadline" ] || return 1
      sleep 0.5
    done
  done
}

# measure SERVER WORKLOAD TARGETS PORT
measure() {
  local server=$1 workload=$2 targets=$3 port=$4 line
  # shellcheck disable=SC2086  # REQUEST holds several words on purpose
  # In the background, so that a signal to this script is handled at once, not after the run.
  "$LOADGEN" --targets "$targets" --port "$port" ${REQUEST[$workload]} --window "$WINDOW" \
    --warmup "$WARMUP" --duration "$DURATION" --cpu "$LOADGEN_CPU" --quiet >"$WORK/result" &
  LOADGEN_PID=$!
  wait "$LOADGEN_PID" || true
  LOADGEN_PID=
  line=$(grep '^RESULT' "$WORK/result" || true)
  RESULT["$server $workload"]=$line
  log "$server $workload: ${line:-no result}"
}

# wanted WORKLOAD: true when the workload is among those to run.
wanted() { [[ " ${WORKLOADS[*]} " == *" $1 "* ]]; }

v2_workloads() {
  local workload
  for workload in "${WORKLOADS[@]}"; do [ "$workload" = get-v3 ] || echo "$workload"; done
}

# measure_v3 SERVER TARGETS PORT GROUP [LAST]: the SNMPv3 workload, once the first target (and
# the LAST address) answer an SNMPv3 Get.
measure_v3() {
  local server=$1 targets=$2 port=$3 group=$4 first
  wanted get-v3 || return 0
  first=${targets%%+*}
  # shellcheck disable=SC2086  # V3_OPTIONS holds several words on purpose
  if ! wait_for_answer "$first,${5:-$first}" "$port" 10 "$group" $V3_OPTIONS; then
    log "$server did not answer an SNMPv3 authPriv Get as $V3_USER; what the load generator sees:"
    # shellcheck disable=SC2086
    "$LOADGEN" --targets "$first" --port "$port" --get 1.3.6.1.2.1.1.5.0 --window 1 --warmup 0 --duration 1 \
      $V3_OPTIONS 2>&1 | sed 's/^/  /' >&2 || true
    return 0
  fi
  measure "$server" get-v3 "$targets" "$port"
}

field() {  # field "RESULT line" KEY
  sed -nE "s/.* $2=([^ ]+).*/\1/p" <<<"$1"
}

# ensure_package PACKAGE PROGRAM
ensure_package() {
  [ -x "$2" ] && return 0
  if [ "$(id -u)" -ne 0 ]; then log "$2 is missing (install the Debian package $1)"; return 1; fi
  log "installing $1"
  apt-get update -qq
  DEBIAN_FRONTEND=noninteractive apt-get install -y -qq --no-install-recommends "$1" >/dev/null
}

build_tools() {
  if [ ! -f "$BUILD/build.ninja" ]; then
    cmake -S "$ROOT" -B "$BUILD" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
  fi
  cmake --build "$BUILD" --target tessel_loadgen tessel_echo -- -j2 >/dev/null
}

run_snmpd() {
  ensure_package snmpd /usr/sbin/snmpd || return 0
  mkdir -p "$WORK/snmpd"
  chmod 777 "$WORK/snmpd"
  printf 'agentAddress udp:127.0.0.1:%s\nrocommunity public 127.0.0.1\ncreateUser %s SHA %s AES %s\nrouser %s priv\n' \
    "$SNMPD_PORT" "$V3_USER" "$V3_AUTH" "$V3_PRIV" "$V3_USER" >"$WORK/snmpd/snmpd.conf"
  local user=()
  [ "$(id -u)" -eq 0 ] && user=(-u nobody)
  start_server snmpd env SNMP_PERSISTENT_DIR="$WORK/snmpd" /usr/sbin/snmpd -f -Lo -C -c "$WORK/snmpd/snmpd.conf" \
    "${user[@]}"
  local group=$SERVER_GROUP workload
  if ! wait_for_answer 127.0.0.1 "$SNMPD_PORT" 30 "$group"; then
    log "snmpd did not answer; its log:"; tail -n 20 "$WORK/snmpd.log" >&2
    finish_server "$group"; return 0
  fi
  for workload in $(v2_workloads); do measure snmpd "$workload" 127.0.0.1 "$SNMPD_PORT"; done
  measure_v3 snmpd 127.0.0.1 "$SNMPD_PORT" "$group"
  skipped snmpsim || record_snmpd
  finish_server "$group"
}

# The system group and ifTable of the running snmpd, as snmpsim's data file for community public.
record_snmpd() {
  ensure_package snmpsim /usr/bin/snmprec || return 0
  mkdir -p "$WORK/snmpsim" "$WORK/snmpsim-cache"
  chmod 755 "$WORK/snmpsim"
  chmod 777 "$WORK/snmpsim-cache"
  snmprec --agent-udpv4-endpoint=127.0.0.1:"$SNMPD_PORT" --community=public --start-object=1.3.6.1.2.1.1 \
    --stop-object=1.3.6.1.2.1.3 --output-file="$WORK/snmpsim/public.snmprec" >"$WORK/snmprec.log" 2>&1 ||
    { log "snmprec failed:"; tail -n 5 "$WORK/snmprec.log" >&2; rm -f "$WORK/snmpsim/public.snmprec"; }
}

run_snmpsim() {
  [ -s "$WORK/snmpsim/public.snmprec" ] || { log "no recording of snmpd: snmpsim left out"; return 0; }
  local user=()
  [ "$(id -u)" -eq 0 ] && user=(--process-user=nobody --process-group=nogroup)
  start_server snmpsim snmpsimd --data-dir="$WORK/snmpsim" --agent-udpv4-endpoint=127.0.0.1:"$SNMPSIM_PORT" \
    --cache-dir="$WORK/snmpsim-cache" "${user[@]}"
  local group=$SERVER_GROUP workload
  if ! wait_for_answer 127.0.0.1 "$SNMPSIM_PORT" 60 "$group"; then
    log "snmpsim did not answer; its log:"; tail -n 20 "$WORK/snmpsim.log" >&2
    finish_server "$group"; return 0
  fi
  for workload in $(v2_workloads); do measure snmpsim "$workload" 127.0.0.1 "$SNMPSIM_PORT"; done
  finish_server "$group"
}

run_echo() {
  local bound
  bound=$(awk -v w="$WARMUP" -v d="$DURATION" 'BEGIN { printf "%d", w + d + 30 }')
  start_server echo "$ECHO" --address 127.0.0.1 --port "$ECHO_PORT" --duration "$bound"
  local group=$SERVER_GROUP
  if wait_for_answer 127.0.0.1 "$ECHO_PORT" 10 "$group"; then
    if wanted get; then measure echo get 127.0.0.1 "$ECHO_PORT"; fi
  else
    log "the echo server did not answer"
  fi
  finish_server "$group"
}

tessel_available() {
  ! grep -q 'simulated network is not available yet' "$ROOT/tessel"
}

run_tessel() {
  if ! tessel_available; then log "./tessel run is not available yet: Tessel is pending"; return 0; fi
  # The launcher builds what it runs; doing that now, unpinned, keeps the build out of the
  # start-up time-out and off the server CPU.
  log "building Tessel"
  "$ROOT/tessel" run --help >/dev/null 2>&1 || { log "./tessel run --help failed: Tessel is pending"; return 0; }
  local last first
  first=$TESSEL_ADDRESS
  last=$(python3 -c 'import ipaddress,sys; print(ipaddress.ip_address(sys.argv[1]) + int(sys.argv[2]) - 1)' \
    "$first" "$DEVICES")
  local v3 with_v3=no
  tessel_v3_options && with_v3=yes
  start_server tessel "$ROOT/tessel" run --devices "$DEVICES" --address "$first" --snmp-port "$TESSEL_PORT" \
    "${v3[@]+"${v3[@]}"}"
  local group=$SERVER_GROUP workload
  if ! wait_for_answer "$first,$last" "$TESSEL_PORT" "$TESSEL_START_TIMEOUT" "$group"; then
    log "Tessel did not answer on $first and $last; its log:"; tail -n 30 "$WORK/tessel.log" >&2
    finish_server "$group"; return 0
  fi
  for workload in $(v2_workloads); do measure tessel "$workload" "$first+$DEVICES" "$TESSEL_PORT"; done
  if [ "$with_v3" = yes ]; then measure_v3 tessel "$first+$DEVICES" "$TESSEL_PORT" "$group" "$last"; fi
  finish_server "$group"
}

# choose_v3_user: sets V3_USER, V3_AUTH, V3_PRIV and the load generator's V3_OPTIONS, and
# V3_CONFIG to a Tessel configuration with that user, or to nothing when Tessel's default
# configuration has it already.
V3_CONFIG=
choose_v3_user() {
  local found=
  if [ -z "${BENCH_V3_USER:-}" ] && [ -f "$ROOT/profiles/snmpv3.conf" ]; then
    found=$(awk '$1 == "user" && $3 == "SHA_AUTH" && $5 == "CFB_AES_128" { print $2, $4, $6; exit }' \
      "$ROOT/profiles/snmpv3.conf")
  fi
  if [ -n "$found" ]; then
    read -r V3_USER V3_AUTH V3_PRIV <<<"$found"
  else
    V3_USER=${BENCH_V3_USER:-bench}
    V3_AUTH=${BENCH_V3_AUTH:-shapassword}
    V3_PRIV=${BENCH_V3_PRIV:-aespassword}
    V3_CONFIG=$WORK/snmpv3.conf
    cat >"$V3_CONFIG" <<CONF
user $V3_USER SHA_AUTH $V3_AUTH CFB_AES_128 $V3_PRIV
context ""
group 3 $V3_USER benchgroup
access benchgroup "" 3 3 1 all "" ""
view all 1 "" 1
CONF
  fi
  V3_OPTIONS="--v3-user $V3_USER --v3-auth-pass $V3_AUTH --v3-priv-pass $V3_PRIV"
  REQUEST[get-v3]="--get 1.3.6.1.2.1.1.5.0 $V3_OPTIONS"
}

# tessel_v3_options: true when Tessel can run the SNMPv3 workload; sets the array v3 to the
# launcher options that give it the user (none with the default configuration).
tessel_v3_options() {
  v3=()
  wanted get-v3 || return 1
  if ! "$ROOT/tessel" run --help 2>&1 | grep -q -- '--snmpv3'; then
    log "./tessel run has no --snmpv3 option yet: Tessel's SNMPv3 workload left out"; return 1
  fi
  if [ -n "$V3_CONFIG" ]; then v3=(--snmpv3 "$V3_CONFIG"); fi
}

# ratio A B: A / B to two decimals, or "-".
ratio() {
  if [ "$1" != - ] && [ "$2" != - ] && [ "$2" != 0 ]; then
    awk -v a="$1" -v b="$2" 'BEGIN { printf "%.2f", a / b }'
  else
    echo -
  fi
}

# cell SERVER WORKLOAD KEY: a field of a result, or "-".
cell() {
  local line=${RESULT["$1 $2"]:-}
  [ -n "$line" ] && field "$line" "$3" || echo -
}

latency() {
  local line=${RESULT["$1 $2"]:-}
  [ -n "$line" ] && printf '%s/%s' "$(field "$line" p50_us)" "$(field "$line" p99_us)" || echo -
}

print_table() {
  local workload ratio tessel snmpd
  printf '\n%-8s %9s %9s %9s %9s %13s %18s %18s %18s %18s\n' workload tessel/s snmpd/s snmpsim/s echo/s \
    tessel/snmpd 'tessel p50/p99 us' 'snmpd p50/p99 us' 'snmpsim p50/p99 us' 'echo p50/p99 us'
  for workload in "${WORKLOADS[@]}"; do
    tessel=$(cell tessel "$workload" rate)
    snmpd=$(cell snmpd "$workload" rate)
    ratio=$(ratio "$tessel" "$snmpd")
    printf '%-8s %9s %9s %9s %9s %13s %18s %18s %18s %18s\n' "$workload" "$tessel" "$snmpd" \
      "$(cell snmpsim "$workload" rate)" "$(cell echo "$workload" rate)" "$ratio" \
      "$(latency tessel "$workload")" "$(latency snmpd "$workload")" "$(latency snmpsim "$workload")" \
      "$(latency echo "$workload")"
  done
  printf '\nwindow %s, %s s warm-up + %s s measured, server on CPU %s, load generator on CPU %s, %s Tessel agents\n' \
    "$WINDOW" "$WARMUP" "$DURATION" "$SERVER_CPU" "$LOADGEN_CPU" "$DEVICES"
  if wanted get-v3; then
    printf 'get-v3: SNMPv3 authPriv (HMAC-SHA-96, AES-128) Get of sysName.0; v3/v2c Get in this run: tessel %s, snmpd %s\n' \
      "$(ratio "$(cell tessel get-v3 rate)" "$(cell tessel get rate)")" \
      "$(ratio "$(cell snmpd get-v3 rate)" "$(cell snmpd get rate)")"
  fi
  print_anomalies
}

# Anything other than a clean answer to every request is listed, never hidden in the rate.
print_anomalies() {
  local key line k v
  for key in "${!RESULT[@]}"; do
    line=${RESULT[$key]}
    for k in lost errors malformed late not_response wrong_source send_failures; do
      [ "$k" = not_response ] && [[ $key == echo* ]] && continue  # the echo server returns requests
      v=$(field "$line" "$k")
      [ -n "$v" ] && [ "$v" != 0 ] && printf 'note: %s: %s=%s (of %s sent)\n' "$key" "$k" "$v" "$(field "$line" sent)"
    done
  done
  return 0
}

main() {
  choose_v3_user
  build_tools
  skipped echo || run_echo
  skipped snmpd || run_snmpd
  skipped snmpsim || run_snmpsim
  skipped tessel || run_tessel
  print_table
}

main "$@"
