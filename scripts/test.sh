#!/usr/bin/env bash
# The project's test command: installs the Debian packages it needs when they are missing,
# then builds and runs
#   1. the whole suite (build/),
#   2. the whole suite again under AddressSanitizer + UndefinedBehaviorSanitizer (build-asan/)
#      (the upload past 2 GiB sends 3 MB there: it runs whole in the plain build only),
#   3. the engine, client and controller tests, the stress test among them, under
#      ThreadSanitizer (build-tsan/),
#   4. every fuzz target for a few seconds on its seed corpus (build-fuzz/, clang),
# and prints one reliability report at the end. It fails when the tests grow past 0.34 of the
# product's lines (scripts/test-size.sh).
# CI=true turns warnings into errors.
# ZV_TEST_STAGES picks stages (default "plain asan tsan fuzz").
set -euo pipefail
cd "$(dirname "$0")/.."
top=$PWD

# shellcheck source=scripts/deps.sh
. scripts/deps.sh
zv_install_deps

werror=OFF
[ "${CI:-}" = "true" ] && werror=ON
stages=${ZV_TEST_STAGES:-plain asan tsan fuzz}
for stage in $stages; do
  case $stage in
  plain | asan | tsan | fuzz) ;;
  *)
    echo "unknown stage '$stage' in ZV_TEST_STAGES (plain, asan, tsan, fuzz)" >&2
    exit 2
    ;;
  esac
done
jobs=$(nproc)

export ZV_REPORT_DIR="$top/build/report"
rm -rf "$ZV_REPORT_DIR"
mkdir -p "$ZV_REPORT_DIR"
status=0

# The tests may not grow past the product's size times this ratio (the figures are in the
# report). It only ever comes down, towards a third, as tests are merged.
size_max=0.34
if ! bash scripts/test-size.sh --max "$size_max" >"$ZV_REPORT_DIR/size.txt" 2>&1; then
  status=1
fi

# Runs ctest in a build folder; one report line with the counts.
run_suite() {
  local name=$1 dir=$2
  shift 2
  local log="$ZV_REPORT_DIR/$dir${ZV_LOG_SUFFIX:-}.log" start=$SECONDS rc=0
  ctest --test-dir "$dir" --output-on-failure -j2 --timeout 600 "$@" >"$log" 2>&1 || rc=$?
  # The summary and what went wrong; the whole output stays in the log.
  grep -a -E '\*\*\*|tests passed|Failure|ERROR: |WARNING: ThreadSanitizer|runtime error|CMake Error' \
    "$log" || true
  local summary skipped
  summary=$(grep -a -E '[0-9]+% tests passed' "$log" | tail -n 1) || true
  # "100% tests passed, 0 tests failed out of 0" ran nothing.
  if [[ "$summary" == *"out of 0"* ]]; then
    summary=""
  fi
  skipped=$(grep -a -c -E '\*\*\*Skipped|Not Run' "$log") || true
  printf '%-34s %s; %s skipped (%ss)\n' "$name" "${summary:-no tests ran}" "${skipped:-0}" \
    "$((SECONDS - start))" >>"$ZV_REPORT_DIR/sanitizers.txt"
  # Each skipped test with the reason it gave (from the tests' whole output).
  if [ -f "$dir/Testing/Temporary/LastTest.log" ]; then
    awk '/: Skipped$/ { getline reason; next }
         /^\[  SKIPPED \] [^ ]+ \(/ { printf "  skipped: %s: %s\n", $4, reason; reason = "" }' \
      "$dir/Testing/Temporary/LastTest.log" >>"$ZV_REPORT_DIR/sanitizers.txt" || true
  fi
  if [ "$rc" != 0 ] || [ -z "$summary" ]; then
    status=1
  fi
}

configure() { # dir, extra cmake arguments
  local dir=$1
  shift
  cmake -S . -B "$dir" -DCMAKE_BUILD_TYPE=RelWithDebInfo -DZV_WERROR="$werror" "$@" >/dev/null
}

if [[ " $stages " == *" plain "* ]]; then
  echo "== build and tests"
  configure build
  cmake --build build -j"$jobs"
  run_suite "plain build, whole suite" build
fi

if [[ " $stages " == *" asan "* ]]; then
  echo "== AddressSanitizer + UndefinedBehaviorSanitizer"
  configure build-asan -DZV_SANITIZE=address
  cmake --build build-asan -j"$jobs"
  # Leak reports carry whole stacks (the libraries have no frame pointers), so that the
  # suppressions can name the third-party functions that allocate.
  LSAN_OPTIONS="suppressions=$top/tests/sanitizers/lsan.supp:print_suppressions=0" \
  ASAN_OPTIONS="halt_on_error=1:detect_leaks=1:fast_unwind_on_malloc=0" \
  UBSAN_OPTIONS="print_stacktrace=1:halt_on_error=1" \
    run_suite "address+undefined, whole suite" build-asan
fi

if [[ " $stages " == *" tsan "* ]]; then
  echo "== ThreadSanitizer"
  configure build-tsan -DZV_SANITIZE=thread
  # The transfer engine, the service client and the controller, in process and as the real
  # service, with the programs those tests start.
  cmake --build build-tsan -j"$jobs" --target zv-plugin-curl-test zv-plugin-main-test \
    zv-upload-ctrl-test zv-upload-ctrl-e2e-test zv-upload-svc-e2e-test \
    zuvo-upload-svc zuvo-devserver zuvo-client zv-vconf zv-keystore zv_resources
  # GLib's slice allocator hands blocks between threads through locks of its own that the
  # sanitizer does not see (GLib is not built for it): a list node freed on one thread and
  # reused on another reads as a race. Plain malloc, which the sanitizer follows, instead.
  export G_SLICE=always-malloc
  export ZV_COMPANION_TSAN_OPTIONS="halt_on_error=1:suppressions=$top/tests/sanitizers/tsan-companion.supp"
  TSAN_OPTIONS="halt_on_error=1:second_deadlock_stack=1:suppressions=$top/tests/sanitizers/tsan.supp" \
    run_suite "thread: engine, client, controller" build-tsan \
    -R '^(Engine|ClientTest|RunningUploadTest|UploadCtrlTest|CtrlE2ETest|ServiceE2ETest)'
  # The stress test again with two more seeds (each run prints its seed in the report).
  for seed in ${ZV_STRESS_SEEDS:-7 4242}; do
    ZV_STRESS_SEED=$seed ZV_LOG_SUFFIX="-stress-$seed" \
    TSAN_OPTIONS="halt_on_error=1:second_deadlock_stack=1:suppressions=$top/tests/sanitizers/tsan.supp" \
      run_suite "thread: stress, seed $seed" build-tsan -R 'CtrlE2ETest.Stress'
  done
fi

if [[ " $stages " == *" fuzz "* ]]; then
  echo "== fuzz targets"
  if ! bash scripts/fuzz.sh --seconds "${ZV_FUZZ_SECONDS:-5}" --report "$ZV_REPORT_DIR/fuzz.txt"; then
    status=1
  fi
fi

echo
echo "== reliability report"
# Tests that skip themselves for want of room write why to skipped.txt.
for part in size sanitizers fuzz skipped; do
  if [ -s "$ZV_REPORT_DIR/$part.txt" ]; then
    echo "-- $part"
    cat "$ZV_REPORT_DIR/$part.txt"
  fi
done
if [ "$status" = 0 ]; then
  echo "all stages passed"
else
  echo "SOME STAGES FAILED (logs in $ZV_REPORT_DIR)"
fi
exit "$status"
