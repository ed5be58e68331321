#!/usr/bin/env bash
# Screenshots of the upload list into doc/screenshots/ (or the folder given as $1).
#
# app-list.png, app-placeholder.png: the application itself under xvfb-run (with a small
#   window manager), over a history
#   prepared through the companion client (a waiting, an uploading, a paused and a completed
#   job; no network, so nothing moves), captured from Xvfb's frame buffer.
# list.png, placeholder.png, menu.png, edit.png, stop-question.png: the list view test program
#   walking the same states and edit mode headless (ELM_ENGINE=buffer), saving its canvas.
#
# Builds what it needs into $ZV_BUILD_DIR (default build/). Everything else lives in a
# temporary folder that is removed at the end.
set -euo pipefail
cd "$(dirname "$0")/.."

build=${ZV_BUILD_DIR:-build}
out=${1:-doc/screenshots}
mkdir -p "$out"
out=$(realpath "$out")

cmake -S . -B "$build" >/dev/null
cmake --build "$build" -j2 --target zuvo-upload-svc zuvo-client zv-upload-view-test zv_resources
build=$(realpath "$build")

work=$(mktemp -d /tmp/zv-shots-XXXXXX)
app_pid=""
xvfb_pid=""
cleanup() {
    if [ -n "$app_pid" ]; then
        kill "$app_pid" 2>/dev/null || true
    fi
    if [ -n "$xvfb_pid" ]; then
        wait "$xvfb_pid" 2>/dev/null || true
    fi
    rm -rf "$work"
}
trap cleanup EXIT

# A fresh environment, as the tests' TempDir makes it.
use_env() {
    local dir=$1
    mkdir -p "$dir"
    export ZV_RUNTIME_DIR=$dir/run ZV_HISTORY_DB=$dir/db/.zuvo-history.db
    export ZV_KEY_STORAGE_DIR=$dir/keys ZV_MEDIA_DB=$dir/media.db ZV_DLOG_FILE=$dir/zuvo.log
    export ZV_NETWORK=keys ZV_RES_DIR=$build/res/
    unset ZV_LOCATION
}

# Runs the application under Xvfb until its list view is built, then saves the screen.
shoot_app() {
    local dir=$1 png=$2
    local fb=$dir/fb
    mkdir -p "$fb"
    # A window manager: without one, EFL's X11 engine never gets the first configure event
    # it waits for and draws nothing. The application's pid is written out, so that it alone
    # is stopped; then the window manager goes and xvfb-run ends its server.
    xvfb-run -a -s "-screen 0 360x640x24 -nocursor -fbdir $fb" sh -c '
        matchbox-window-manager -use_titlebar no >/dev/null 2>&1 &
        wm=$!
        "$2" &
        echo $! > "$1"
        wait $!
        kill $wm' sh "$dir/app.pid" "$build/bin/zuvo-upload-svc" \
        </dev/null >"$dir/app.out" 2>&1 &
    xvfb_pid=$!
    local i
    for i in $(seq 1 50); do
        [ -s "$dir/app.pid" ] && break
        sleep 0.1
    done
    app_pid=$(cat "$dir/app.pid")
    for i in $(seq 1 100); do
        grep -q 'Create \(items genlist\|nocontents layout\)' "$ZV_DLOG_FILE" 2>/dev/null && break
        sleep 0.1
    done
    sleep 1.5 # let the first frames render
    python3 scripts/screenshots.py xwd2png "$fb/Xvfb_screen0" "$png"
    kill "$app_pid"
    app_pid=""
    wait "$xvfb_pid" 2>/dev/null || true
    xvfb_pid=""
    echo "saved $png"
}

if command -v xvfb-run >/dev/null && command -v matchbox-window-manager >/dev/null; then
    use_env "$work/empty"
    shoot_app "$work/empty" "$out/app-placeholder.png"

    use_env "$work/jobs"
    python3 scripts/screenshots.py prepare "$work/jobs" "$build/bin/zuvo-client"
    shoot_app "$work/jobs" "$out/app-list.png"
else
    echo "xvfb-run or matchbox-window-manager is missing (scripts/deps.sh installs them):" \
        "no screenshots of the application itself" >&2
fi

use_env "$work/view"
ELM_ENGINE=buffer ZV_SCREENSHOT_DIR=$out \
    "$build/bin/zv-upload-view-test" --gtest_filter=ViewTest.Screenshots
ls -1 "$out"
