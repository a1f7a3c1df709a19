#!/usr/bin/env bash
# End-to-end: both questions asked on a private X server and answered with key presses, as a user
# would. Message id 1 (may an application use a font found on disk) is answered with Return, the
# default button Allow: Result 1. Message id 2 (may fonts be downloaded) is answered with Return,
# the default button Skip: Result 0. Skipped (77) without Xvfb or xdotool.
#
# usage: xvfb-alerts.sh AGENT GLYPHWELL
set -uo pipefail

agent=${1:?usage: xvfb-alerts.sh AGENT GLYPHWELL}
tool=${2:?usage: xvfb-alerts.sh AGENT GLYPHWELL}
port_name=org.glyphwell.Glyphwell.GlyphwellUIAgent

for program in Xvfb xdotool; do
    if ! command -v "$program" >/dev/null; then
        echo "SKIP: $program is not installed"
        exit 77
    fi
done

work=$(mktemp -d /tmp/glyphwell-e2e-XXXXXX)
chmod 700 "$work"
xvfb_pid=""
agent_pid=""
client_pid=""
stop() { # pid: TERM, a short grace, then KILL
    kill "$1" 2>/dev/null || return 0
    for _ in $(seq 30); do
        kill -0 "$1" 2>/dev/null || break
        sleep 0.1
    done
    kill -KILL "$1" 2>/dev/null || true
    wait "$1" 2>/dev/null || true
}
cleanup() {
    [ -z "$client_pid" ] || stop "$client_pid"
    [ -z "$agent_pid" ] || stop "$agent_pid"
    [ -z "$xvfb_pid" ] || stop "$xvfb_pid"
    rm -rf "$work"
}
trap cleanup EXIT
trap 'exit 2' INT TERM

fail() {
    echo "FAIL: $*" >&2
    if [ -s "$work/agent.log" ]; then
        echo "--- agent log:" >&2
        cat "$work/agent.log" >&2
    fi
    exit 1
}

# A display nobody uses: Xvfb picks it and writes its number once it accepts connections.
Xvfb -displayfd 3 -screen 0 1024x768x24 -nolisten tcp 3>"$work/display" >"$work/xvfb.log" 2>&1 &
xvfb_pid=$!
for _ in $(seq 100); do
    [ -s "$work/display" ] && break
    kill -0 "$xvfb_pid" 2>/dev/null || break
    sleep 0.1
done
[ -s "$work/display" ] || fail "Xvfb did not start: $(cat "$work/xvfb.log")"
display=$(head -n 1 "$work/display" | tr -d '[:space:]')
export DISPLAY=":$display"
unset WAYLAND_DISPLAY

# A private runtime directory (the socket), data home (the catalog) and font setup: one
# downloadable asset for a font that no system has installed.
mkdir -p "$work/runtime" "$work/data/glyphwell" "$work/cache"
chmod 700 "$work/runtime"
cat >"$work/data/glyphwell/downloadable-fonts.json" <<'JSON'
{
  "assets": [
    {
      "LocalID": "org.glyphwell.e2e.TestSans",
      "url": "http://127.0.0.1:9/GlyphwellTestSans.ttf",
      "size": 123456,
      "sha256": "9f86d081884c7d659a2feaa0c55ad015a3bf4f1b2b0b822cd15d6c15b0f00a08",
      "fonts": [{"postScriptName": "GlyphwellTestSans-Regular", "family": "Glyphwell Test Sans"}]
    }
  ]
}
JSON
export XDG_RUNTIME_DIR="$work/runtime"
export XDG_DATA_HOME="$work/data"
export XDG_CACHE_HOME="$work/cache"
export QT_QPA_PLATFORM=xcb
socket="$XDG_RUNTIME_DIR/$port_name"

font_file=""
for candidate in /usr/share/fonts/truetype/dejavu/DejaVuSans.ttf \
    $(fc-list --format '%{file}\n' 2>/dev/null | grep -E '\.(ttf|otf)$' | head -n 1); do
    if [ -r "$candidate" ]; then
        font_file=$candidate
        break
    fi
done
[ -n "$font_file" ] || fail "no font file found to offer as a candidate"

"$agent" >"$work/agent.log" 2>&1 &
agent_pid=$!
for _ in $(seq 150); do
    [ -S "$socket" ] && break
    kill -0 "$agent_pid" 2>/dev/null || fail "the agent exited at start"
    sleep 0.1
done
[ -S "$socket" ] || fail "the agent did not create $socket"

previous_window=""
# ask NAME KEYS EXPECTED ARGS...: sends the request in the background, waits for the agent's alert,
# presses KEYS and checks that the compact reply holds EXPECTED.
ask() {
    local name=$1 keys=$2 expected=$3
    shift 3
    timeout 25 "$tool" "$@" --compact --timeout 20 >"$work/$name.reply" 2>"$work/$name.err" &
    client_pid=$!
    # The alert is a visible agent window other than the previous alert (which is hidden by now).
    local window="" deadline=$((SECONDS + 10)) found
    while [ -z "$window" ] && [ $SECONDS -lt $deadline ]; do
        for found in $(timeout 2 xdotool search --onlyvisible --pid "$agent_pid" 2>/dev/null); do
            [ "$found" = "$previous_window" ] || window=$found
        done
        [ -n "$window" ] || sleep 0.1
    done
    [ -n "$window" ] || fail "no $name alert appeared"
    previous_window=$window
    # Mapped is not yet focusable everywhere, and a question drops keys for 1 s after it shows.
    sleep 1.2
    timeout 5 xdotool windowfocus --sync "$window" 2>/dev/null || true
    sleep 0.2
    # shellcheck disable=SC2086 # one word per key
    timeout 5 xdotool key --clearmodifiers $keys
    local status
    wait "$client_pid"
    status=$?
    client_pid=""
    [ "$status" = 0 ] || fail "the $name request failed ($status): $(cat "$work/$name.err")"
    echo "$name reply: $(cat "$work/$name.reply")"
    grep -qF "$expected" "$work/$name.reply" || fail "the $name reply lacks $expected"
}

# shellcheck disable=SC2016 # the dollars are the tagged JSON's own
ask activation Return '"QZUIPropertyResult":{"$number":1,"$type":7}' \
    ask-activation --candidate "$font_file" --app Demo
# shellcheck disable=SC2016
ask download Return '"QZUIPropertyResult":{"$number":0,"$type":7}' \
    ask-download --font "GlyphwellTestSans-Regular:Glyphwell Test Sans" --app Demo

kill -0 "$agent_pid" 2>/dev/null || fail "the agent is gone after the replies"
echo "PASS"
