#!/usr/bin/env bash
# ./tessel bench: the same SNMP workloads, in one run, against Tessel, net-snmp snmpd, snmpsim
# (serving a recording of that snmpd) and a UDP echo server (the machine's ceiling), all on
# loopback, the server pinned to one CPU and the load generator to another. Prints one table of
# responses/s, Tessel's ratios to the others and latency. Tessel runs BENCH_DEVICES agents: the
# workloads go to one of them, as to the other servers' single agent, and "spread" sends the Get
# round robin to all of them. "get-paced" repeats each server's Get at half the rate it has just
# sustained, for the latency below saturation. The SNMPv3 workload (authPriv, SHA + AES) runs
# against Tessel and snmpd, both given the same user. bench/scale.sh measures start, memory, idle
# CPU and stop with many agents.
#
# Environment (defaults in brackets):
#   BENCH_WARMUP [3]  BENCH_DURATION [10]  seconds of warm-up and of measurement per figure
#   BENCH_WINDOW [64]  outstanding requests       BENCH_DEVICES [10000]  Tessel agents
#   BENCH_SERVER_CPU [0]  BENCH_LOADGEN_CPU [1]
#   BENCH_SNMPD_PORT [11161]  BENCH_TESSEL_PORT [11171]  BENCH_SNMPSIM_PORT [11181]
#   BENCH_ECHO_PORT [12000]  BENCH_ECHO_SPREAD_ADDRESS [127.4.0.1]  first of the echo server's
#     sockets for spread (as many as Tessel has agents)
#   BENCH_TESSEL_ADDRESS [127.0.1.1]  BENCH_TESSEL_START_TIMEOUT [300] seconds
#   BENCH_SKIP [""]  any of "tessel snmpd snmpsim echo" to leave out (snmpsim needs snmpd)
#   BENCH_WORKLOADS ["get get-paced getnext getbulk get-v3 spread"]  the workloads to run, in
#     order (get-paced needs get before it; spread and get-v3 are run last)
#   BENCH_V3_USER  BENCH_V3_AUTH  BENCH_V3_PRIV  the SNMPv3 user (SHA, AES) and its passwords
#     [the first such user of profiles/snmpv3.conf, Tessel's default; without one: bench,
#     shapassword, aespassword, given to Tessel with --snmpv3]
set -euo pipefail

LOG_TAG=bench
# shellcheck source=bench/lib.sh
. "$(dirname "${BASH_SOURCE[0]}")/lib.sh"

WARMUP=${BENCH_WARMUP:-3}
DURATION=${BENCH_DURATION:-10}
WINDOW=${BENCH_WINDOW:-64}
DEVICES=${BENCH_DEVICES:-10000}
SERVER_CPU=${BENCH_SERVER_CPU:-0}
LOADGEN_CPU=${BENCH_LOADGEN_CPU:-1}
SNMPD_PORT=${BENCH_SNMPD_PORT:-11161}
TESSEL_PORT=${BENCH_TESSEL_PORT:-11171}
ECHO_PORT=${BENCH_ECHO_PORT:-12000}
SNMPSIM_PORT=${BENCH_SNMPSIM_PORT:-11181}
ECHO_SPREAD_ADDRESS=${BENCH_ECHO_SPREAD_ADDRESS:-127.4.0.1}
TESSEL_ADDRESS=${BENCH_TESSEL_ADDRESS:-127.0.1.1}
TESSEL_START_TIMEOUT=${BENCH_TESSEL_START_TIMEOUT:-300}
SKIP=${BENCH_SKIP:-}
ECHO=$BUILD/bench/tessel_echo
SERVER_PIN=(taskset -c "$SERVER_CPU")

read -r -a WORKLOADS <<<"${BENCH_WORKLOADS:-get get-paced getnext getbulk get-v3 spread}"
declare -A REQUEST=(
  [get]="--get 1.3.6.1.2.1.1.5.0"
  [getnext]="--getnext 1.3.6.1.2.1.1"
  [getbulk]="--getbulk 1.3.6.1.2.1.2.2 --non-repeaters 0 --max-repetitions 10"
)
REQUEST[get-paced]=${REQUEST[get]}
REQUEST[spread]=${REQUEST[get]}
declare -A RESULT=()  # "server workload" -> RESULT line of the load generator

skipped() { [[ " $SKIP " == *" $1 "* ]]; }

# measure SERVER WORKLOAD TARGETS PORT [LOADGEN OPTIONS...]
measure() {
  local server=$1 workload=$2 targets=$3 port=$4 line
  shift 4
  # shellcheck disable=SC2086  # REQUEST holds several words on purpose
  interruptibly "$WORK/result" "$LOADGEN" --targets "$targets" --port "$port" ${REQUEST[$workload]} \
    --window "$WINDOW" --warmup "$WARMUP" --duration "$DURATION" --cpu "$LOADGEN_CPU" --quiet "$@"
  line=$(grep '^RESULT' "$WORK/result" || true)
  RESULT["$server $workload"]=$line
  log "$server $workload: ${line:-no result}"
}

# wanted WORKLOAD: true when the workload is among those to run.
wanted() { [[ " ${WORKLOADS[*]} " == *" $1 "* ]]; }

# measure_v2c SERVER TARGET PORT: the v2c workloads in the order asked for, against one address.
# get-paced is the Get again at half the rate the server has just sustained, for its latency
# below saturation. The echo server returns each request as it is: only its Gets mean something.
measure_v2c() {
  local server=$1 target=$2 port=$3 workload rate
  for workload in "${WORKLOADS[@]}"; do
    [ "$server" = echo ] && [ "$workload" != get ] && [ "$workload" != get-paced ] && continue
    case $workload in
      get-v3 | spread) ;;
      get-paced)
        rate=$(half_get_rate "$server")
        if [ -n "$rate" ]; then
          measure "$server" get-paced "$target" "$port" --rate "$rate"
        else
          log "$server get-paced: no saturated Get figure before it; left out"
        fi
        ;;
      *) measure "$server" "$workload" "$target" "$port" ;;
    esac
  done
}

# half_get_rate SERVER: half the server's measured Get rate, or nothing.
half_get_rate() {
  local rate
  rate=$(cell "$1" get rate)
  [ "$rate" != - ] && [ "$rate" -gt 1 ] && echo $((rate / 2))
  return 0
}

# measure_v3 SERVER TARGET PORT GROUP: the SNMPv3 workload, once the target answers an SNMPv3 Get.
measure_v3() {
  local server=$1 target=$2 port=$3 group=$4
  wanted get-v3 || return 0
  # shellcheck disable=SC2086  # V3_OPTIONS holds several words on purpose
  if ! wait_for_answer "$target" "$port" 10 "$group" $V3_OPTIONS; then
    log "$server did not answer an SNMPv3 authPriv Get as $V3_USER; what the load generator sees:"
    # shellcheck disable=SC2086
    "$LOADGEN" --targets "$target" --port "$port" --get 1.3.6.1.2.1.1.5.0 --window 1 --warmup 0 --duration 1 \
      $V3_OPTIONS 2>&1 | sed 's/^/  /' >&2 || true
    return 0
  fi
  measure "$server" get-v3 "$target" "$port"
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
  local group=$SERVER_GROUP
  if ! wait_for_answer 127.0.0.1 "$SNMPD_PORT" 30 "$group"; then
    log "snmpd did not answer; its log:"; tail -n 20 "$WORK/snmpd.log" >&2
    finish_server "$group"; return 0
  fi
  measure_v2c snmpd 127.0.0.1 "$SNMPD_PORT"
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
  local group=$SERVER_GROUP
  if ! wait_for_answer 127.0.0.1 "$SNMPSIM_PORT" 60 "$group"; then
    log "snmpsim did not answer; its log:"; tail -n 20 "$WORK/snmpsim.log" >&2
    finish_server "$group"; return 0
  fi
  measure_v2c snmpsim 127.0.0.1 "$SNMPSIM_PORT"
  finish_server "$group"
}

run_echo() {
  local bound
  bound=$(awk -v w="$WARMUP" -v d="$DURATION" 'BEGIN { printf "%d", 2 * (w + d) + 30 }')
  start_server echo "$ECHO" --address 127.0.0.1 --port "$ECHO_PORT" --duration "$bound"
  local group=$SERVER_GROUP
  if wait_for_answer 127.0.0.1 "$ECHO_PORT" 10 "$group"; then
    measure_v2c echo 127.0.0.1 "$ECHO_PORT"
  else
    log "the echo server did not answer"
  fi
  finish_server "$group"
  if wanted spread; then run_echo_spread "$bound"; fi
}

# The echo server on as many sockets as Tessel has agents, the Get round robin over them: the
# machine's own ceiling when every request comes to another socket.
run_echo_spread() {
  local first=$ECHO_SPREAD_ADDRESS last
  last=$(address_plus "$first" $((DEVICES - 1)))
  start_server echo "$ECHO" --address "$first+$DEVICES" --port "$ECHO_PORT" --duration "$1"
  local group=$SERVER_GROUP
  if wait_for_answer "$first,$last" "$ECHO_PORT" 30 "$group"; then
    measure echo spread "$first+$DEVICES" "$ECHO_PORT"
  else
    log "the echo server on $DEVICES sockets did not answer"
  fi
  finish_server "$group"
}

# Tessel serves DEVICES agents; the workloads go to the first, as to the other servers' one
# agent, and the spread Get round robin to all of them.
run_tessel() {
  build_tessel || return 0
  local first=$TESSEL_ADDRESS last
  last=$(address_plus "$first" $((DEVICES - 1)))
  local v3 with_v3=no
  tessel_v3_options && with_v3=yes
  start_server tessel "$ROOT/tessel" run --devices "$DEVICES" --address "$first" --snmp-port "$TESSEL_PORT" \
    "${v3[@]+"${v3[@]}"}"
  local group=$SERVER_GROUP
  if ! wait_for_answer "$first,$last" "$TESSEL_PORT" "$TESSEL_START_TIMEOUT" "$group"; then
    log "Tessel did not answer on $first and $last; its log:"; tail -n 30 "$WORK/tessel.log" >&2
    finish_server "$group"; return 0
  fi
  measure_v2c tessel "$first" "$TESSEL_PORT"
  if [ "$with_v3" = yes ]; then measure_v3 tessel "$first" "$TESSEL_PORT" "$group"; fi
  if wanted spread; then measure tessel spread "$first+$DEVICES" "$TESSEL_PORT"; fi
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

# cell SERVER WORKLOAD KEY: a field of a result, or "-".
cell() {
  local line=${RESULT["$1 $2"]:-}
  [ -n "$line" ] && field "$line" "$3" || echo -
}

# latency SERVER WORKLOAD: p50/p99 in microseconds; p50/p99/p99.9 for the paced Get.
latency() {
  local line=${RESULT["$1 $2"]:-}
  if [ -z "$line" ]; then echo -; return; fi
  printf '%s/%s' "$(field "$line" p50_us)" "$(field "$line" p99_us)"
  if [ "$2" = get-paced ]; then printf '/%s' "$(field "$line" p999_us)"; fi
  echo
}

TABLE_FORMAT='%-9s %9s %9s %9s %9s %8s %8s %8s %22s %22s %22s %22s\n'

print_table() {
  local workload tessel snmpd snmpsim echo ratios
  # shellcheck disable=SC2059  # the format is a constant
  printf "\n$TABLE_FORMAT" workload tessel/s snmpd/s snmpsim/s echo/s 'x snmpd' 'x snmpsim' '% echo' \
    'tessel p50/p99 us' 'snmpd p50/p99 us' 'snmpsim p50/p99 us' 'echo p50/p99 us'
  for workload in "${WORKLOADS[@]}"; do
    tessel=$(cell tessel "$workload" rate)
    snmpd=$(cell snmpd "$workload" rate)
    snmpsim=$(cell snmpsim "$workload" rate)
    echo=$(cell echo "$workload" rate)
    ratios=(- - -)
    case $workload in
      get-paced) ;;  # a rate asked for: nothing to compare
      spread) ratios=(- - "$(ratio "$tessel" "$echo" 100)") ;;
      *) ratios=("$(ratio "$tessel" "$snmpd")" "$(ratio "$tessel" "$snmpsim")" "$(ratio "$tessel" "$echo" 100)") ;;
    esac
    # shellcheck disable=SC2059
    printf "$TABLE_FORMAT" "$workload" "$tessel" "$snmpd" "$snmpsim" "$echo" "${ratios[@]}" \
      "$(latency tessel "$workload")" "$(latency snmpd "$workload")" "$(latency snmpsim "$workload")" \
      "$(latency echo "$workload")"
  done
  printf '\nwindow %s, %s s warm-up + %s s measured, server on CPU %s, load generator on CPU %s\n' \
    "$WINDOW" "$WARMUP" "$DURATION" "$SERVER_CPU" "$LOADGEN_CPU"
  printf 'Tessel runs %s agents: every workload but spread goes to one of them (%s), as to the other\n' \
    "$DEVICES" "$TESSEL_ADDRESS"
  printf "servers' one agent; spread sends the Get round robin to all %s. get-paced: the Get paced at\n" \
    "$DEVICES"
  printf 'half the rate each server sustained in get.\n'
  printf 'targets: Get and GetNext >= 1.5 x snmpd, GetBulk >= 2 x snmpd, all >= 50 x snmpsim, Get >= 40 %% of echo\n'
  if wanted spread; then
    printf 'spread: Tessel Get over %s agents / over one: %s (target >= 0.90); the echo server over %s\n' \
      "$DEVICES" "$(ratio "$(cell tessel spread rate)" "$(cell tessel get rate)")" "$DEVICES"
    printf 'sockets / over one: %s (the cost of a socket per request on this machine)\n' \
      "$(ratio "$(cell echo spread rate)" "$(cell echo get rate)")"
  fi
  if wanted get-paced; then
    printf 'latency: Tessel p99 at %s Gets/s (half its saturated rate): %s us (target <= 2000 us)\n' \
      "$(cell tessel get-paced rate)" "$(cell tessel get-paced p99_us)"
  fi
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
