#!/usr/bin/env bash
# The project's test command: installs the Debian packages it needs when they are missing,
# configures build/, builds everything and runs the whole test suite.
# CI=true turns warnings into errors.
set -euo pipefail
cd "$(dirname "$0")/.."

# shellcheck source=scripts/deps.sh
. scripts/deps.sh
zv_install_deps

werror=OFF
[ "${CI:-}" = "true" ] && werror=ON

cmake -S . -B build -DCMAKE_BUILD_TYPE=RelWithDebInfo -DZV_WERROR="$werror"
cmake --build build -j"$(nproc)"
ctest --test-dir build --output-on-failure -j2 --timeout 600
