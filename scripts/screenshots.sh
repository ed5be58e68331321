#!/usr/bin/env bash
# Screenshots of the service into doc/screenshots/ (or the folder given as $1): the real
# application in a virtual X server (xvfb-run, with a small window manager), over a history
# prepared through the companion client (a waiting, an uploading, a paused and a completed
# job; no network, so nothing moves), driven with keys and taps (xdotool) and captured from
# Xvfb's frame buffer.
#
#   list.png  menu.png  edit.png  stop-question.png  placeholder.png   the light colour table
#   the same five with -dark                                            ZV_THEME=dark
#   list-2x.png                                                         ELM_SCALE=2
#
# Builds what it needs into $ZV_BUILD_DIR (default build/). Everything else lives in a
# temporary folder that is removed at the end. The host's screen reader counts as off (a
# fresh settings folder), so its notice never shows.
set -euo pipefail
self=$(realpath "$0")
cd "$(dirname "$self")/.."

# Phone screen at scale 1, and where the taps go on it (the theme's sizes at scale 1): the
# title bar is 56 px high, the select-all bar 56, a row 88; the menu's entry sits 8 px above
# the bottom edge and is 56 high; Done is the title bar's right button.
W=360 H=640
TITLE_H=56 SELECT_ALL_H=56 ROW_H=88

if [ "${1:-}" = "--session" ]; then
    # One run of the application inside xvfb-run: $2 work folder, $3 output prefix, $4 what
    # to shoot ("walk": list, menu, edit, question; "one": the first screen only).
    dir=$2 prefix=$3 what=$4 scale=${ELM_SCALE:-1}
    log=$ZV_DLOG_FILE
    px() { awk -v v="$1" -v s="$scale" 'BEGIN { printf "%d", v * s }'; }
    wait_log() { # text [count]
        local i n
        for i in $(seq 1 150); do
            n=$(grep -c -- "$1" "$log" 2>/dev/null) || true
            [ "${n:-0}" -ge "${2:-1}" ] && return 0
            sleep 0.1
        done
        echo "screenshots: no \"$1\" in the log" >&2
        return 1
    }
    shoot() {
        sleep 1.2 # the slide or fade in progress comes to rest
        python3 scripts/screenshots.py xwd2png "$dir/fb/Xvfb_screen0" "$1"
        echo "saved $1"
    }
    tap() { xdotool mousemove "$(px "$1")" "$(px "$2")" click 1; }

    matchbox-window-manager -use_titlebar no >/dev/null 2>&1 &
    wm=$!
    "$ZV_BUILD/bin/zuvo-upload-svc" >"$dir/app.out" 2>&1 &
    app=$!
    trap 'kill $app $wm 2>/dev/null || true' EXIT
    wait_log 'Create \(items genlist\|nocontents layout\)'
    if [ "$what" = one ]; then
        shoot "$prefix.png"
        exit 0
    fi
    shoot "$prefix/list$SUFFIX.png"
    xdotool key F2
    wait_log '_menu_btn_clicked_cb'
    shoot "$prefix/menu$SUFFIX.png"
    tap $((W / 2)) $((H - 8 - 28))
    wait_log '_zv_upload_edit_btn_click'
    sleep 0.6
    first=$((TITLE_H + SELECT_ALL_H + ROW_H / 2))
    tap $((W / 2)) $first
    sleep 0.5 # two taps in a row would be one double tap
    tap $((W / 2)) $((first + 3 * ROW_H))
    wait_log '__zv_upload_list_item_of_edit_mode_select_cb' 2
    shoot "$prefix/edit$SUFFIX.png"
    tap $((W - 36)) $((TITLE_H / 2))
    wait_log 'Need question popup'
    shoot "$prefix/stop-question$SUFFIX.png"
    exit 0
fi

build=${ZV_BUILD_DIR:-build}
out=${1:-doc/screenshots}
mkdir -p "$out"
out=$(realpath "$out")
for tool in xvfb-run matchbox-window-manager xdotool; do
    command -v $tool >/dev/null || { echo "$tool is missing (scripts/deps.sh installs it)" >&2; exit 1; }
done

cmake -S . -B "$build" >/dev/null
cmake --build "$build" -j2 --target zuvo-upload-svc zuvo-client zv_resources
export ZV_BUILD
ZV_BUILD=$(realpath "$build")

work=$(mktemp -d /tmp/zv-shots-XXXXXX)
trap '[ -n "${ZV_SHOTS_KEEP:-}" ] || rm -rf "$work"' EXIT

# A fresh environment, as the tests' TempDir makes it; no session bus, so no desktop
# notifications.
use_env() {
    local dir=$1
    mkdir -p "$dir/fb"
    export ZV_RUNTIME_DIR=$dir/run ZV_HISTORY_DB=$dir/db/.zuvo-history.db
    export ZV_KEY_STORAGE_DIR=$dir/keys ZV_MEDIA_DB=$dir/media.db ZV_DLOG_FILE=$dir/zuvo.log
    export ZV_NETWORK=keys ZV_RES_DIR=$ZV_BUILD/res/
    unset ZV_LOCATION DBUS_SESSION_BUS_ADDRESS
}

# session NAME THEME SCALE WHAT PREFIX: one run under its own virtual X server.
session() {
    local name=$1 theme=$2 scale=$3 what=$4 prefix=$5 jobs=$6
    local dir=$work/$name
    use_env "$dir"
    if [ "$jobs" = jobs ]; then
        python3 scripts/screenshots.py prepare "$dir" "$ZV_BUILD/bin/zuvo-client"
    fi
    local w h
    w=$(awk -v v=$W -v s="$scale" 'BEGIN { printf "%d", v * s }')
    h=$(awk -v v=$H -v s="$scale" 'BEGIN { printf "%d", v * s }')
    SUFFIX=$([ "$theme" = dark ] && echo -dark || true) ZV_THEME=$theme ELM_SCALE=$scale \
        xvfb-run -a -s "-screen 0 ${w}x${h}x24 -nocursor -fbdir $dir/fb" \
        "$self" --session "$dir" "$prefix" "$what" </dev/null
}

for theme in light dark; do
    suffix=$([ $theme = dark ] && echo -dark || true)
    session "walk-$theme" $theme 1 walk "$out" jobs
    session "empty-$theme" $theme 1 one "$out/placeholder$suffix" none
done
session list-2x light 2 one "$out/list-2x" jobs
# The title bars follow the tables.
python3 scripts/screenshots.py title-colour "$out/list.png" \
    res/tables/zuvo-upload-svc_ChangeableColorInfo.xml
python3 scripts/screenshots.py title-colour "$out/list-dark.png" \
    res/tables/dark/zuvo-upload-svc_ChangeableColorInfo.xml
ls -1 "$out"
