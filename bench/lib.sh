# shellcheck shell=bash
# Shared by the benchmark scripts (sourced, after LOG_TAG is set): a temporary directory, servers
# each in a process group of its own that are always stopped when the script ends (also on Ctrl-C),
# bounded waits for an SNMP answer, and the load generator's RESULT lines.

ROOT=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)
BUILD=${TESSEL_BUILD:-$ROOT/build}
LOADGEN=$BUILD/bench/tessel_loadgen
STOP_TIMEOUT=${BENCH_STOP_TIMEOUT:-10}
export LC_NUMERIC=C  # a decimal point in EPOCHREALTIME and awk's numbers

SERVER_PIN=()  # a command prefix for the servers, e.g. (taskset -c 0)
SERVER_GROUPS=()
CHILD_PID=
WORK=$(mktemp -d /tmp/tessel-bench.XXXXXX)
chmod 711 "$WORK"  # servers that drop to nobody reach their own subdirectories

log() { printf '%s: %s\n' "${LOG_TAG:-bench}" "$*" >&2; }

# Stops the load generator and every server still running, and removes the temporary directory.
cleanup() {
  local group
  [ -n "$CHILD_PID" ] && kill -TERM "$CHILD_PID" 2>/dev/null
  for group in "${SERVER_GROUPS[@]}"; do stop_group "$group"; done
  rm -rf "$WORK"
}
trap cleanup EXIT
trap 'exit 130' INT TERM

# elapsed START: the seconds since START (an EPOCHREALTIME), to two decimals.
elapsed() {
  awk -v from="$1" -v to="$EPOCHREALTIME" 'BEGIN { printf "%.2f", to - from }'
}

# interruptibly OUTPUT COMMAND...: runs COMMAND with its stdout in OUTPUT. In the background, so
# that a signal to this script is handled at once, not after the command.
interruptibly() {
  local output=$1
  shift
  "$@" >"$output" &
  CHILD_PID=$!
  wait "$CHILD_PID" || true
  CHILD_PID=
}

pause() { interruptibly /dev/null sleep "$1"; }

# stop_group PGID: SIGTERM to the group, then SIGKILL to whatever is left of it after
# STOP_TIMEOUT seconds. Sets STOPPED_IN to the seconds until the group had gone, or to "killed".
stop_group() {
  local group=$1 start deadline
  start=$EPOCHREALTIME
  STOPPED_IN=0
  kill -TERM -- "-$group" 2>/dev/null || return 0
  deadline=$((SECONDS + STOP_TIMEOUT))
  while kill -0 -- "-$group" 2>/dev/null; do
    if [ "$SECONDS" -ge "$deadline" ]; then
      log "process group $group ignored SIGTERM for $STOP_TIMEOUT s; killing it"
      kill -KILL -- "-$group" 2>/dev/null || true
      for ((deadline = 0; deadline < 100; deadline++)); do
        kill -0 -- "-$group" 2>/dev/null || break
        sleep 0.02
      done
      STOPPED_IN=killed
      return 0
    fi
    sleep 0.02
  done
  # shellcheck disable=SC2034  # read by the caller
  STOPPED_IN=$(elapsed "$start")
}

# start_server NAME COMMAND...: runs COMMAND (after SERVER_PIN) in a new process group, its output
# in $WORK/NAME.log; sets SERVER_GROUP.
start_server() {
  local name=$1
  shift
  setsid "${SERVER_PIN[@]+"${SERVER_PIN[@]}"}" "$@" >"$WORK/$name.log" 2>&1 </dev/null &
  SERVER_GROUP=$!
  SERVER_GROUPS+=("$SERVER_GROUP")
}

# finish_server PGID: stops the group (see stop_group) and forgets it.
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
      sleep 0.1
    done
  done
}

field() {  # field "RESULT line" KEY
  sed -nE "s/.* $2=([^ ]+).*/\1/p" <<<"$1"
}

# ratio A B [SCALE]: SCALE * A / B to two decimals, or "-".
ratio() {
  if [ "$1" != - ] && [ "$2" != - ] && [ "$2" != 0 ]; then
    awk -v a="$1" -v b="$2" -v s="${3:-1}" 'BEGIN { printf "%.2f", s * a / b }'
  else
    echo -
  fi
}

# address_plus ADDRESS N: the IPv4 address N after ADDRESS.
address_plus() {
  local a b c d n
  IFS=. read -r a b c d <<<"$1"
  n=$(((a << 24 | b << 16 | c << 8 | d) + $2))
  printf '%d.%d.%d.%d\n' $((n >> 24 & 255)) $((n >> 16 & 255)) $((n >> 8 & 255)) $((n & 255))
}

# offset_addresses FIRST: for each number read, one a line, the IPv4 address that far after FIRST.
offset_addresses() {
  awk -v first="$1" '
    BEGIN { split(first, o, "."); base = ((o[1] * 256 + o[2]) * 256 + o[3]) * 256 + o[4] }
    { n = base + $1
      printf "%d.%d.%d.%d\n", int(n / 16777216) % 256, int(n / 65536) % 256, int(n / 256) % 256, n % 256 }'
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

tessel_available() {
  ! grep -q 'simulated network is not available yet' "$ROOT/tessel"
}

# build_tessel: the launcher builds what it runs; doing that first keeps the build out of any
# time-out or timing.
build_tessel() {
  if ! tessel_available; then log "./tessel run is not available yet: Tessel is pending"; return 1; fi
  log "building Tessel"
  "$ROOT/tessel" run --help >/dev/null 2>&1 || { log "./tessel run --help failed: Tessel is pending"; return 1; }
}
