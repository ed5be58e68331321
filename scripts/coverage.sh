#!/usr/bin/env bash
# Line coverage of the product by the whole suite: builds build-cov/ with gcov's
# instrumentation, runs every test there (the programs the tests start write their counts
# too), and prints gcovr's summary per folder, then for upload-common/ and upload-svc/ each.
# ZV_COVERAGE_TESTS: a ctest -R regex to run fewer tests.
set -euo pipefail
cd "$(dirname "$0")/.."

# shellcheck source=scripts/deps.sh
. scripts/deps.sh
ZV_DEB_PACKAGES+=(gcovr)
zv_install_deps

dir=build-cov
cmake -S . -B "$dir" -DCMAKE_BUILD_TYPE=Debug -DCMAKE_C_FLAGS=--coverage \
  -DCMAKE_CXX_FLAGS=--coverage -DCMAKE_EXE_LINKER_FLAGS=--coverage \
  -DCMAKE_SHARED_LINKER_FLAGS=--coverage >/dev/null
cmake --build "$dir" -j"$(nproc)"
find "$dir" -name '*.gcda' -delete
ctest --test-dir "$dir" -j2 --timeout 600 ${ZV_COVERAGE_TESTS:+-R "$ZV_COVERAGE_TESTS"} \
  >"$dir/coverage-tests.log" 2>&1 || echo "some tests failed: see $dir/coverage-tests.log"
tail -n 3 "$dir/coverage-tests.log"
for folder in upload-common upload-svc platform tools; do
  printf '%-14s ' "$folder/"
  gcovr -r . --object-directory "$dir" --filter "$folder/" --gcov-ignore-parse-errors -s \
    2>/dev/null | grep '^lines:'
done
gcovr -r . --object-directory "$dir" --filter 'upload-common/' --filter 'upload-svc/' \
  --gcov-ignore-parse-errors --json-summary "$dir/coverage.json" >/dev/null 2>&1 || true
echo "per file: $dir/coverage.json"
