#!/usr/bin/env bash
# Builds the libFuzzer targets with clang (build-fuzz/) and runs each for a bounded time on a
# scratch copy of its seed corpus (tests/fuzz/corpus/<target>/ is never changed), printing
# executions, corpus growth and findings per target. Exit status 1 on any finding.
#
#   scripts/fuzz.sh [--seconds N] [--report FILE] [TARGET...]
#
#   --seconds N    time per target (default 60)
#   --report FILE  also write the table to FILE
#   TARGET         zv-extract, zv-atom, zv-launch, zv-files (default: all)
# A finding's input is kept in build-fuzz/findings/<target>/.
set -euo pipefail
cd "$(dirname "$0")/.."

seconds=60
report=""
targets=()
while [ $# -gt 0 ]; do
  case "$1" in
    --seconds) seconds="$2"; shift 2 ;;
    --report) report="$2"; shift 2 ;;
    -h|--help) sed -n '2,12p' "$0" | sed 's/^# \{0,1\}//'; exit 0 ;;
    -*) echo "fuzz.sh: unknown option $1" >&2; exit 2 ;;
    *) targets+=("$1"); shift ;;
  esac
done
if [ ${#targets[@]} -eq 0 ]; then
  for dir in tests/fuzz/corpus/*/; do
    targets+=("$(basename "$dir")")
  done
fi

CC=clang CXX=clang++ cmake -S . -B build-fuzz -DCMAKE_BUILD_TYPE=RelWithDebInfo -DZV_FUZZ=ON \
  -DBUILD_TESTING=OFF >/dev/null
cmake --build build-fuzz -j"$(nproc)" --target "${targets[@]/%/-fuzz}" >/dev/null

scratch=$(mktemp -d "${TMPDIR:-/tmp}/zv-fuzz-XXXXXX")
trap 'rm -rf "$scratch"' EXIT
export ZV_DLOG_FILE=/dev/null
export ASAN_OPTIONS="halt_on_error=1:detect_leaks=1"
export UBSAN_OPTIONS="print_stacktrace=1:halt_on_error=1"

table=$(printf '%-12s %10s %8s %14s %9s\n' TARGET SECONDS EXECS "CORPUS (SEED)" FINDINGS)
found=0
for t in "${targets[@]}"; do
  corpus="$scratch/$t"
  findings="build-fuzz/findings/$t"
  mkdir -p "$corpus" "$findings"
  cp tests/fuzz/corpus/"$t"/* "$corpus"/
  seeds=$(find "$corpus" -type f | wc -l)
  log="$scratch/$t.log"
  rc=0
  "build-fuzz/bin/$t-fuzz" -max_total_time="$seconds" -timeout=10 -rss_limit_mb=2048 \
    -print_final_stats=1 -artifact_prefix="$findings/" "$corpus" >"$log" 2>&1 || rc=$?
  execs=$(sed -n 's/^stat::number_of_executed_units: *//p' "$log" | tail -n 1)
  size=$(find "$corpus" -type f | wc -l)
  crashes=$(find "$findings" -type f | wc -l)
  if [ "$rc" != 0 ] || [ "$crashes" != 0 ]; then
    found=1
    grep -a -E 'ERROR|SUMMARY|runtime error|Test unit written' "$log" | head -n 5 >&2 || true
  fi
  table+=$(printf '\n%-12s %10s %8s %14s %9s' "$t" "$seconds" "${execs:-0}" "$size ($seeds)" "$crashes")
done
table+=$'\n'
if [ "$found" = 0 ]; then
  table+="no findings"
else
  table+="FINDINGS: inputs kept in build-fuzz/findings/"
fi
printf '%s\n' "$table"
[ -n "$report" ] && printf '%s\n' "$table" >"$report"
exit "$found"
