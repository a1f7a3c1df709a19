#!/usr/bin/env bash
# End-to-end: the agent started on demand by its socket. systemd-socket-activate holds the
# listening socket; the agent must not run before the first connection, must answer a request for
# an unknown message id (empty reply), and must exit by itself about 10 s after that reply.
#
# usage: socket-activation.sh AGENT GLYPHWELL
set -uo pipefail

agent=${1:?usage: socket-activation.sh AGENT GLYPHWELL}
tool=${2:?usage: socket-activation.sh AGENT GLYPHWELL}

command -v systemd-socket-activate >/dev/null ||
    { echo "SKIP: systemd-socket-activate is not installed" && exit 77; }

runtime=$(mktemp -d /tmp/glyphwell-e2e-XXXXXX)
chmod 700 "$runtime"
activator_pid=""
cleanup() { # the activator execs the agent in place, so one pid covers both: TERM, 3 s, KILL
    if [ -n "$activator_pid" ]; then
        kill "$activator_pid" 2>/dev/null
        timeout 3 tail --pid="$activator_pid" -f /dev/null
        kill -KILL "$activator_pid" 2>/dev/null
        wait "$activator_pid" 2>/dev/null
    fi
    rm -rf "$runtime"
}
trap cleanup EXIT
trap 'exit 2' INT TERM

fail() {
    echo "FAIL: $*" >&2
    [ -s "$runtime/agent.log" ] && { echo "--- agent log:" && cat "$runtime/agent.log"; } >&2
    exit 1
}

# True while the activator's process is the agent (it execs the agent on the first connection).
agent_running() {
    [ "$(readlink "/proc/$activator_pid/exe" 2>/dev/null)" = "$(readlink -f "$agent")" ]
}

export XDG_RUNTIME_DIR="$runtime" QT_QPA_PLATFORM=offscreen
socket="$runtime/org.glyphwell.Glyphwell.GlyphwellUIAgent"
systemd-socket-activate -l "$socket" -E XDG_RUNTIME_DIR -E QT_QPA_PLATFORM -E HOME -E PATH \
    -E ASAN_OPTIONS -E UBSAN_OPTIONS -E LSAN_OPTIONS "$agent" >"$runtime/agent.log" 2>&1 &
activator_pid=$!

for _ in $(seq 100); do [ -S "$socket" ] && break || sleep 0.05; done
[ -S "$socket" ] || fail "systemd-socket-activate did not create $socket"
# Nothing may start the agent but a connection: give it half a second to show itself wrongly.
sleep 0.5
agent_running && fail "the agent runs before any request"
kill -0 "$activator_pid" 2>/dev/null || fail "systemd-socket-activate exited early"

reply=$(timeout 20 "$tool" send --msgid 3 --empty --timeout 15 2>"$runtime/tool.err")
status=$?
replied_at=$(date +%s.%N)
[ "$status" = 0 ] || fail "glyphwell send exited with $status: $(cat "$runtime/tool.err")"
[ -z "$reply" ] || fail "expected an empty reply, got: $reply"
agent_running || fail "the agent is not running after the first request"

# The idle exit comes 10 s after the last reply; give up after 20 s.
for _ in $(seq 200); do agent_running && sleep 0.1 || break; done
agent_running && fail "the agent still runs 20 s after its reply"
gone_at=$(date +%s.%N)
wait "$activator_pid"
exit_status=$?
activator_pid=""

elapsed=$(awk -v a="$replied_at" -v b="$gone_at" 'BEGIN { printf "%.1f", b - a }')
echo "the agent exited with status $exit_status, $elapsed s after its reply"
awk -v e="$elapsed" 'BEGIN { exit !(e >= 9 && e <= 15) }' ||
    fail "idle exit after $elapsed s, expected 9 to 15 s"
[ "$exit_status" = 0 ] || fail "the agent exited with status $exit_status"
echo "PASS"
