#!/usr/bin/env bash
# End-to-end: the agent started on demand by its socket. systemd-socket-activate holds the
# listening socket; the agent must not run before the first connection, must answer a request for
# an unknown message id (empty reply), and must exit by itself about 10 s after that reply.
#
# usage: socket-activation.sh AGENT GLYPHWELL
set -uo pipefail

agent=${1:?usage: socket-activation.sh AGENT GLYPHWELL}
tool=${2:?usage: socket-activation.sh AGENT GLYPHWELL}
port_name=org.glyphwell.Glyphwell.GlyphwellUIAgent

if ! command -v systemd-socket-activate >/dev/null; then
    echo "SKIP: systemd-socket-activate is not installed"
    exit 77
fi

runtime=$(mktemp -d /tmp/glyphwell-e2e-XXXXXX)
chmod 700 "$runtime"
activator_pid=""
cleanup() {
    if [ -n "$activator_pid" ]; then
        # The activator execs the agent in its own process, so one pid covers both.
        kill "$activator_pid" 2>/dev/null || true
        for _ in $(seq 30); do
            kill -0 "$activator_pid" 2>/dev/null || break
            sleep 0.1
        done
        kill -KILL "$activator_pid" 2>/dev/null || true
        wait "$activator_pid" 2>/dev/null || true
    fi
    rm -rf "$runtime"
}
trap cleanup EXIT
trap 'exit 2' INT TERM

fail() {
    echo "FAIL: $*" >&2
    if [ -s "$runtime/agent.log" ]; then
        echo "--- agent log:" >&2
        cat "$runtime/agent.log" >&2
    fi
    exit 1
}

# The agent's own process, found by its executable: systemd-socket-activate forks it on the first
# connection (without --accept it execs it in place, so the activator's pid becomes the agent).
agent_running() {
    [ -n "$activator_pid" ] || return 1
    local exe
    exe=$(readlink "/proc/$activator_pid/exe" 2>/dev/null) || return 1
    [ "$exe" = "$(readlink -f "$agent")" ]
}

export XDG_RUNTIME_DIR="$runtime"
export QT_QPA_PLATFORM=offscreen
socket="$runtime/$port_name"

systemd-socket-activate -l "$socket" -E XDG_RUNTIME_DIR -E QT_QPA_PLATFORM -E HOME -E PATH \
    -E ASAN_OPTIONS -E UBSAN_OPTIONS -E LSAN_OPTIONS \
    "$agent" >"$runtime/agent.log" 2>&1 &
activator_pid=$!

for _ in $(seq 100); do
    [ -S "$socket" ] && break
    sleep 0.05
done
[ -S "$socket" ] || fail "systemd-socket-activate did not create $socket"

sleep 0.5
if agent_running; then
    fail "the agent runs before any request"
fi
kill -0 "$activator_pid" 2>/dev/null || fail "systemd-socket-activate exited early"

reply=$(timeout 20 "$tool" send --msgid 3 --empty --timeout 15 2>"$runtime/tool.err")
status=$?
replied_at=$(date +%s.%N)
[ "$status" = 0 ] || fail "glyphwell send exited with $status: $(cat "$runtime/tool.err")"
[ -z "$reply" ] || fail "expected an empty reply, got: $reply"
agent_running || fail "the agent is not running after the first request"

# Poll until the agent has gone; the idle exit comes 10 s after the last reply.
gone_at=""
for _ in $(seq 200); do # 20 s
    if ! agent_running; then
        gone_at=$(date +%s.%N)
        break
    fi
    sleep 0.1
done
[ -n "$gone_at" ] || fail "the agent still runs 20 s after its reply"
wait "$activator_pid"
exit_status=$?
activator_pid=""

elapsed=$(awk -v a="$replied_at" -v b="$gone_at" 'BEGIN { printf "%.1f", b - a }')
echo "the agent exited with status $exit_status, $elapsed s after its reply"
awk -v e="$elapsed" 'BEGIN { exit !(e >= 9 && e <= 15) }' ||
    fail "idle exit after $elapsed s, expected 9 to 15 s"
[ "$exit_status" = 0 ] || fail "the agent exited with status $exit_status"
echo "PASS"
