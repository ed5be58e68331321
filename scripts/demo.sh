#!/usr/bin/env bash
# The upload service at work, for real, on this machine: a local server on loopback, three
# freshly made video files, the companion client recording them, the service uploading them
# side by side, and a table that says whether the server holds every byte.
#
#   scripts/demo.sh [--size MB] [--interrupt] [--keep] [--prefix DIR]
#
#   --size MB     size of each video (default 8)
#   --interrupt   kill the service in the middle of the uploads and launch it again: the
#                 uploads continue where the server's copies end
#   --keep        leave the service (and its window) and the server running at the end
#   --prefix DIR  run the programs installed under DIR (cmake --install ... --prefix DIR)
#                 instead of building the checkout
#
# Everything lives in a temporary folder (ZV_* environment); nothing of the user's own
# history, keys or notifications is touched. Exit status 0 only when every file arrived
# byte-identical.
set -euo pipefail
cd "$(dirname "$0")/.."

size_mb=8
interrupt=0
keep=0
prefix=""
while [ $# -gt 0 ]; do
  case "$1" in
    --size) size_mb="${2:-}"; shift 2 ;;
    --size=*) size_mb="${1#--size=}"; shift ;;
    --interrupt) interrupt=1; shift ;;
    --keep) keep=1; shift ;;
    --prefix) prefix="${2:-}"; shift 2 ;;
    --prefix=*) prefix="${1#--prefix=}"; shift ;;
    -h|--help) sed -n '2,17p' "$0" | sed 's/^# \{0,1\}//'; exit 0 ;;
    *) echo "demo.sh: unknown argument '$1' (see --help)" >&2; exit 2 ;;
  esac
done
if ! [[ "$size_mb" =~ ^[0-9]+$ ]] || [ "$size_mb" -lt 1 ] || [ "$size_mb" -gt 2000 ]; then
  echo "demo.sh: --size takes a whole number of MB from 1 to 2000" >&2
  exit 2
fi

say() { printf '%s\n' "$*"; }
step() { printf '\n== %s\n' "$*"; }

# ---- programs ----
if [ -n "$prefix" ]; then
  bin="$(cd "$prefix" && pwd)/bin"
  [ -x "$bin/zuvo-upload-svc" ] || { echo "demo.sh: no zuvo-upload-svc in $bin" >&2; exit 2; }
else
  step "packages and build"
  # shellcheck source=scripts/deps.sh
  . scripts/deps.sh
  zv_install_deps
  cmake -S . -B build -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
  cmake --build build -j"$(nproc)" --target zuvo-upload-svc zuvo-client zuvo-devserver \
    zv-vconf zv-keystore zv_resources >/dev/null
  bin="$PWD/build/bin"
  say "built into build/bin"
fi
for p in zuvo-upload-svc zuvo-client zuvo-devserver zv-vconf zv-keystore; do
  [ -x "$bin/$p" ] || { echo "demo.sh: $bin/$p is missing" >&2; exit 1; }
done

# ---- a private world for the service ----
work=$(mktemp -d "${TMPDIR:-/tmp}/zuvo-demo-XXXXXX")
export ZV_RUNTIME_DIR="$work/run"
export ZV_HISTORY_DB="$work/history/.zuvo-history.db"
export ZV_KEY_STORAGE_DIR="$work/keys"
export ZV_MEDIA_DB="$work/media.db"
export ZV_NETWORK=keys
export ZV_DLOG_FILE="$work/service.log"
unset ZV_LOCATION ZV_RES_DIR
if [ -z "${DISPLAY:-}" ] && [ -z "${WAYLAND_DISPLAY:-}" ]; then
  export ELM_ENGINE=buffer
  window="headless: no display"
else
  window="a window on ${DISPLAY:-$WAYLAND_DISPLAY}"
fi

server_pid=""
lock="$ZV_RUNTIME_DIR/zuvo-upload-svc.lock"

# The service holds its instance lock open: the pid of the process that has that file open.
service_pid() {
  local fd
  for fd in /proc/[0-9]*/fd/*; do
    if [ "$(readlink "$fd" 2>/dev/null)" = "$lock" ]; then
      fd="${fd#/proc/}"
      echo "${fd%%/*}"
      return 0
    fi
  done 2>/dev/null
  return 1
}

cleanup() {
  local rc=$?
  if [ "$keep" = 1 ] && [ "$rc" = 0 ]; then
    say ""
    say "Left running (--keep): server pid $server_pid on $host, service pid $(service_pid || echo '-')."
    say "Environment and files: $work (export the ZV_* variables printed in $work/env to use them)."
    env | grep '^ZV_\|^ELM_ENGINE' >"$work/env"
    return
  fi
  local pid
  if pid=$(service_pid); then
    kill -TERM "$pid" 2>/dev/null || true
    for _ in $(seq 50); do kill -0 "$pid" 2>/dev/null || break; sleep 0.1; done
    kill -KILL "$pid" 2>/dev/null || true
  fi
  if [ -n "$server_pid" ]; then
    kill -TERM "$server_pid" 2>/dev/null || true
    wait "$server_pid" 2>/dev/null || true
  fi
  if [ "$rc" = 0 ]; then
    rm -rf "$work"
  else
    say "Logs kept in $work (service.log, requests.log)."
  fi
}
trap cleanup EXIT

# ---- the server ----
step "local server"
token="demo-token-$RANDOM$RANDOM"
api_key="demo-key-$RANDOM$RANDOM"
"$bin/zuvo-devserver" --storage "$work/server" --token "$token" --api-key "$api_key" \
  --log "$work/requests.log" >"$work/server.out" 2>"$work/server.err" &
server_pid=$!
port=""
for _ in $(seq 100); do
  port=$(sed -n 's/^port \([0-9]*\)$/\1/p' "$work/server.out" | head -n 1)
  [ -n "$port" ] && break
  kill -0 "$server_pid" 2>/dev/null || break
  sleep 0.1
done
[ -n "$port" ] || { echo "demo.sh: the server did not start" >&2; cat "$work/server.err" >&2; exit 1; }
host="127.0.0.1:$port"
export ZV_UPLOAD_HOST="$host" ZV_DATA_HOST="$host" ZV_ACCOUNT_HOST="$host" ZV_TOKEN_HOST="$host"
say "zuvo-devserver listens on $host (storage $work/server)"

admin() { curl -fsS -X "$1" "http://$host/_admin/$2"; }

# ---- the videos ----
step "three videos of $size_mb MB"
mkdir -p "$work/videos"
frame=$((320 * 240 * 3 / 2))
frames=$(( (size_mb * 1000000 + frame - 1) / frame ))
patterns=(smpte ball snow)
files=()
for i in 1 2 3; do
  f="$work/videos/zuvo-demo-$i.mkv"
  if command -v gst-launch-1.0 >/dev/null; then
    gst-launch-1.0 -q videotestsrc num-buffers="$frames" pattern="${patterns[$((i - 1))]}" \
      ! video/x-raw,format=I420,width=320,height=240,framerate=25/1 \
      ! matroskamux ! filesink location="$f" >/dev/null
  else
    head -c "$((size_mb * 1000000))" /dev/urandom >"$f"
  fi
  files+=("$f")
  say "$(basename "$f"): $(stat -c %s "$f") bytes, $frames frames"
done

# ---- keys, history, launch ----
step "API key, network keys, history"
printf '%s' "$api_key" | "$bin/zv-keystore" set zuvo.tizen.api.key
"$bin/zv-vconf" set -t int memory/dnet/status 2
"$bin/zv-vconf" set -t int memory/dnet/network_config 1
"$bin/zv-vconf" set -t string memory/dnet/ip 127.0.0.1
"$bin/zv-vconf" set -t string memory/dnet/proxy ""
"$bin/zuvo-client" add "${files[@]}" >/dev/null
"$bin/zuvo-client" list

if [ "$interrupt" = 1 ]; then
  # Slow every data upload down so that the interruption lands in the middle.
  rate=$(( size_mb * 1000000 / 6 ))
  admin POST "fault?kind=data&action=throttle&rate=$rate&times=0" >/dev/null
fi

# The service keeps the standard error of the launch as its own: the toolkit's complaints
# about missing desktop services go to a file, not into the progress line.
launch() {
  ZV_ACCESS_TOKEN="$token" "$bin/zuvo-client" launch --category People \
    --description "Made by the ZuVo demo" --tag demo --privacy unlisted 2>>"$work/service.err"
}

step "launching the service ($window)"
t0=$(date +%s.%N)
launch

# Percent of all bytes stored as sent, and the rows by status, from the history.
progress() {
  "$bin/zuvo-client" list | awk 'NR > 1 {
      p = $4; sub("%", "", p); done += p * $5 / 100; total += $5; n[$3]++ }
    END {
      s = ""; for (k in n) s = s sprintf(" %s %d", k, n[k]);
      printf "%5.1f%%%s", total ? 100 * done / total : 0, s }'
}
all_completed() {
  [ "$("$bin/zuvo-client" list | awk 'NR > 1 && $3 != "COMPLETED"' | wc -l)" = 0 ]
}
held_percent() {
  admin GET uploads | grep -o '"total":[0-9]*,"held":[0-9]*' |
    awk -F'[:,]' '{ t += $2; h += $4 } END { print t ? int(100 * h / t) : 0 }'
}

deadline=$(( $(date +%s) + 120 + size_mb * 3 ))
follow() {
  local until="$1"
  while :; do
    printf '\r  %s   ' "$(progress)"
    if $until; then printf '\n'; return 0; fi
    if [ "$(date +%s)" -gt "$deadline" ]; then
      printf '\n'
      echo "demo.sh: the uploads did not end in time; see $work/service.log" >&2
      return 1
    fi
    sleep 0.3
  done
}

if [ "$interrupt" = 1 ]; then
  past_a_third() { [ "$(held_percent)" -ge 33 ]; }
  follow past_a_third
  pid=$(service_pid) || { echo "demo.sh: the service is not running" >&2; exit 1; }
  kill -KILL "$pid"
  while kill -0 "$pid" 2>/dev/null; do sleep 0.1; done
  say "killed the service (pid $pid) with $(held_percent)% of the bytes on the server:"
  "$bin/zuvo-client" list
  admin DELETE faults >/dev/null
  step "launching the service again"
  launch
fi
follow all_completed
t1=$(date +%s.%N)

# ---- the table ----
step "result"
uploads=$(admin GET uploads)
fields() { # the upload object whose slug is $1, one member a line
  printf '%s' "$uploads" | tr '{}' '\n\n' | grep "\"slug\":\"$1\"" | head -n 1
}
member() { sed -n "s/.*\"$2\":\"\{0,1\}\([^\",]*\).*/\1/p" <<<"$1"; }
# The seconds from the first to the last request of an upload, from the server's log.
span() {
  grep "\"upload_id\":\"$1\"" "$work/requests.log" |
    sed -n 's/.*"time":\([0-9.]*\).*/\1/p' | sort -n | sed -n '1p;$p' | paste -sd' ' |
    awk '{ print ($2 ? $2 - $1 : 0) }'
}
ok=0
printf '%-18s %12s %9s %12s  %s\n' FILE BYTES SECONDS MB/S "SERVER COPY"
for f in "${files[@]}"; do
  name=$(basename "$f")
  bytes=$(stat -c %s "$f")
  obj=$(fields "$name")
  id=$(member "$obj" id)
  secs=$(span "$id")
  mbps=$(awk -v b="$bytes" -v s="$secs" 'BEGIN { printf "%.1f", (s > 0 ? b / s / 1e6 : 0) }')
  verdict="missing"
  if [ -n "$id" ]; then
    local_sum=$(sha256sum "$f" | cut -d' ' -f1)
    server_sum=$(sha256sum "$work/server/$id.data" 2>/dev/null | cut -d' ' -f1)
    if [ "$(member "$obj" complete)" = true ] && [ "$local_sum" = "$server_sum" ]; then
      verdict="byte-identical"
      ok=$((ok + 1))
    else
      verdict="DIFFERENT"
    fi
  fi
  printf '%-18s %12s %9.2f %12s  %s\n' "$name" "$bytes" "${secs:-0}" "$mbps" "$verdict"
done
statusq=$(grep -c '"kind":"status"' "$work/requests.log" || true)
printf '\n%d of 3 files byte-identical on the server; %.2f s from the launch to the last one' \
  "$ok" "$(awk -v a="$t0" -v b="$t1" 'BEGIN { print b - a }')"
if [ "$interrupt" = 1 ]; then
  printf '; %d status queries after the restart' "$statusq"
fi
printf '.\n'
[ "$ok" = 3 ]
