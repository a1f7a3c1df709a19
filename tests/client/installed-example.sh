#!/usr/bin/env bash
# Installs the client library into a temporary root, builds the C example through pkg-config and
# find_package(GlyphwellClient), checks the exported symbols, and runs it against the agent.
# usage: installed-example.sh BUILD-DIR EXAMPLE.c "EXTRA-CFLAGS" [AGENT]
set -uo pipefail

build=${1:?usage: installed-example.sh BUILD-DIR EXAMPLE.c EXTRA-CFLAGS [AGENT]}
example=${2:?}
extra_flags=${3:-}
agent=${4:-}

work=$(mktemp -d /tmp/glyphwell-client-XXXXXX)
agent_pid=""
cleanup() {
    if [ -n "$agent_pid" ]; then
        kill "$agent_pid" 2>/dev/null || true
        wait "$agent_pid" 2>/dev/null || true
    fi
    rm -rf "$work"
}
trap cleanup EXIT
fail() {
    echo "FAIL: $*" >&2
    [ -s "$work/agent.log" ] && { echo "--- agent log:" >&2; cat "$work/agent.log" >&2; }
    exit 1
}

root=$work/root
for component in client client-dev; do
    DESTDIR=$root cmake --install "$build" --component "$component" >/dev/null ||
        fail "cmake --install --component $component failed"
done
pc=$(find "$root" -name glyphwell-client.pc | head -n1)
[ -n "$pc" ] || fail "no glyphwell-client.pc installed"
libdir=$(dirname "$(dirname "$pc")")
library=$(find "$root" -name 'libglyphwell-client.so.0' | head -n1)
[ -n "$library" ] || fail "no libglyphwell-client.so.0 installed"
# What the library exports: only its own functions.
foreign=$(nm -D --defined-only "$library" | awk '$2 ~ /[TDBRW]/ {print $3}' | grep -v '^glyphwell_' || true)
[ -z "$foreign" ] || fail "the library exports more than its API: $(echo "$foreign" | head -5)"

export PKG_CONFIG_PATH=$(dirname "$pc") PKG_CONFIG_SYSROOT_DIR=$root
# shellcheck disable=SC2046,SC2086
cc -std=c99 -Wall -Werror $extra_flags -o "$work/ask-download" "$example" \
    $(pkg-config --cflags --libs glyphwell-client) || fail "the example does not build from pkg-config"

mkdir -p "$work/project"
cat >"$work/project/CMakeLists.txt" <<CMAKE
cmake_minimum_required(VERSION 3.25)
project(UsesClient C)
find_package(GlyphwellClient 0 REQUIRED)
add_executable(ask-download "$example")
target_compile_options(ask-download PRIVATE $extra_flags)
target_link_options(ask-download PRIVATE $extra_flags)
target_link_libraries(ask-download PRIVATE Glyphwell::client)
CMAKE
prefix=$(dirname "$libdir")
case "$libdir" in */lib/*-linux-gnu) prefix=$(dirname "$prefix") ;; esac
cmake -S "$work/project" -B "$work/project/build" -DCMAKE_PREFIX_PATH="$prefix" >"$work/cmake.log" 2>&1 &&
    cmake --build "$work/project/build" >>"$work/cmake.log" 2>&1 ||
    { cat "$work/cmake.log" >&2; fail "find_package(GlyphwellClient) does not build the example"; }

export LD_LIBRARY_PATH=$libdir
export XDG_RUNTIME_DIR=$work/runtime
mkdir -m 700 "$XDG_RUNTIME_DIR"

out=$("$work/ask-download" Nobody-Regular 2>&1)
[ $? = 1 ] && [ "$out" = "ask-download: the font agent is not running and cannot be started" ] ||
    fail "without an agent, expected the not-running error, got: $out"

if [ -z "$agent" ] || [ ! -x "$agent" ]; then
    echo "SKIP: the agent is not built; the example was built and checked without it"
    exit 77
fi
# Without a catalog nothing can be downloaded: the answer comes at once, without a window.
export XDG_DATA_HOME=$work/data XDG_CONFIG_HOME=$work/config XDG_CACHE_HOME=$work/cache
export XDG_DATA_DIRS=$work/data QT_QPA_PLATFORM=offscreen
"$agent" >"$work/agent.log" 2>&1 &
agent_pid=$!
for _ in $(seq 200); do
    [ -S "$XDG_RUNTIME_DIR/org.glyphwell.Glyphwell.GlyphwellUIAgent" ] && break
    kill -0 "$agent_pid" 2>/dev/null || fail "the agent exited early"
    sleep 0.05
done
for binary in "$work/ask-download" "$work/project/build/ask-download"; do
    out=$(timeout 60 "$binary" Nobody-Regular 2>&1) || fail "$binary: $out"
    [ "$out" = "result 0 suppress 0" ] || fail "$binary: expected 'result 0 suppress 0', got: $out"
done
echo "PASS: built from the installed files; the agent answered: $out"
