#!/usr/bin/env bash
# Builds and runs the benchmarks, printing each figure with its target: the transfer engine
# (zv-engine-bench) and the whole service (zv-service-bench).
# ZV_BENCH_BUILD: the build folder (default build/). Arguments go to zv-engine-bench
# (--size-mib N, --rounds N, --requests N); ZV_SERVICE_BENCH_ARGS to zv-service-bench
# (--size-mib N, --jobs N, --job-mib N, --rows N, --limit-jobs N, --nofile N: the batch of
# 64 KiB jobs with the service alone under an open-file limit). The engine's server is
# zuvo-devserver when the build has it, else the benchmark's own sink server.
set -euo pipefail
cd "$(dirname "$0")/.."

build="${ZV_BENCH_BUILD:-build}"
if [ ! -f "$build/CMakeCache.txt" ]; then
  cmake -S . -B "$build" -DCMAKE_BUILD_TYPE=RelWithDebInfo
fi
cmake --build "$build" -j"$(nproc)" --target zv-engine-bench zv-service-bench zuvo-upload-svc \
  zuvo-client zv-vconf zv-keystore zv_resources
if cmake --build "$build" -j"$(nproc)" --target zuvo-devserver >/dev/null 2>&1 \
   && [ -x "$build/bin/zuvo-devserver" ]; then
  set -- --devserver "$build/bin/zuvo-devserver" "$@"
fi

echo "== transfer engine =="
"$build/bin/zv-engine-bench" "$@"

echo
echo "== upload service =="
# shellcheck disable=SC2086
"$build/bin/zv-service-bench" ${ZV_SERVICE_BENCH_ARGS:-}
