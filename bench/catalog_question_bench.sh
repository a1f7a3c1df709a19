#!/usr/bin/env bash
# The download question's cold cost against the catalog's size: a fresh agent per question on a
# private X server (Xvfb; Qt's offscreen platform when Xvfb is missing), from just before exec to
# the reply of a message id 2 request through the socket, with a user catalog of 1, 7,500 and
# 50,000 assets shaped like real ones (two fonts per asset, a family and two localized names
# each). The request asks, without a confirmation, for a font that no catalog offers: the agent
# looks it up and answers at once, without a window or a download, so the figure is start-up
# plus the catalog's cost. Per size:
#   - compile: the first question, which compiles the catalog's index (one run);
#   - indexed: the index is current (N runs, median and p90);
#   - no index: the index is removed before each question, so the JSON is read and compiled
#     again each time, as every question read it before indexes existed (N runs).
#
# usage: bench/catalog_question_bench.sh AGENT TOOL [N]   (both from a Release build)
set -euo pipefail

agent=${1:?usage: catalog_question_bench.sh AGENT TOOL [N]}
tool=${2:?usage: catalog_question_bench.sh AGENT TOOL [N]}
runs=${3:-15}
work=$(mktemp -d /tmp/glyphwell-question-XXXXXX)
xvfb_pid=
cleanup() {
    [ -n "$xvfb_pid" ] && kill "$xvfb_pid" 2>/dev/null && wait "$xvfb_pid" 2>/dev/null
    rm -rf "$work"
}
trap cleanup EXIT

if command -v Xvfb >/dev/null; then
    display=$((200 + RANDOM % 200))
    Xvfb ":$display" -nolisten tcp -screen 0 1280x1024x24 >/dev/null 2>&1 &
    xvfb_pid=$!
    for _ in $(seq 100); do [ -e "/tmp/.X11-unix/X$display" ] && break; sleep 0.05; done
    export DISPLAY=":$display" QT_QPA_PLATFORM=xcb
else
    export QT_QPA_PLATFORM=offscreen
fi
echo '{"QZUIPropertyApplicationName": "Bench", "QZUIPropertySuppress": true,
       "QZUIPropertyFontProperties": [{"NSFontNameAttribute": "NotInAnyCatalog-Regular"}]}' |
    "$tool" encode -o "$work/request.bin"

python3 - "$agent" "$runs" "$work" "$(dirname "$0")" <<'PY'
import os, random, shutil, sys, tempfile

agent, runs, work = sys.argv[1], int(sys.argv[2]), sys.argv[3]
sys.dont_write_bytecode = True  # no cache files in the source tree
sys.path.insert(0, sys.argv[4])
from agent_port import percentile, start_and_ask, stop  # noqa: E402
request = open(os.path.join(work, "request.bin"), "rb").read()

def catalog(count):
    rng = random.Random(42)
    assets = []
    for i in range(count):
        sha = "".join(rng.choice("0123456789abcdef") for _ in range(64))
        fonts = ", ".join(
            f'{{"postScriptName": "ExampleFamily{i}-{style}", "family": "Example Family {i}", '
            f'"localizedFamilyNames": {{"de": "Beispielfamilie {i}", "fr": "Famille exemple {i}"}}}}'
            for style in ("Regular", "Bold"))
        assets.append(f'{{"LocalID": "com.example.fonts.family{i}", "url": '
                      f'"https://fonts.example.com/downloads/family{i}/ExampleFamily{i}.ttc", '
                      f'"size": {100000 + i}, "sha256": "{sha}", "fonts": [{fonts}]}}')
    return '{"assets": [\n' + ",\n".join(assets) + "\n]}\n"

def question(home):
    runtime = tempfile.mkdtemp(prefix="runtime-", dir=work)
    os.chmod(runtime, 0o700)
    env = dict(os.environ, XDG_RUNTIME_DIR=runtime, XDG_DATA_HOME=home + "/data",
               XDG_DATA_DIRS=home + "/none", XDG_CACHE_HOME=home + "/cache",
               XDG_CONFIG_HOME=home + "/config")
    proc, _, reply_ms = start_and_ask(agent, env, 2, request, 30)
    stop(proc)
    shutil.rmtree(runtime)
    return reply_ms

question(os.path.join(work, "warm-up"))  # file cache, fontconfig cache: not counted
print(f"questions per figure: {runs}; platform {os.environ['QT_QPA_PLATFORM']}")
for count in (1, 7500, 50000):
    home = os.path.join(work, f"assets-{count}")
    os.makedirs(home + "/data/glyphwell")
    with open(home + "/data/glyphwell/downloadable-fonts.json", "w") as f:
        f.write(catalog(count))
    compile_ms = question(home)
    indexed = [question(home) for _ in range(runs)]
    unindexed = []
    for _ in range(runs):
        shutil.rmtree(home + "/cache/glyphwell/catalog-index", ignore_errors=True)
        unindexed.append(question(home))
    print(f"{count:6d} assets  compile {compile_ms:7.1f} ms   indexed median "
          f"{percentile(indexed, 50):6.1f} ms p90 {percentile(indexed, 90):6.1f} ms   "
          f"no index median {percentile(unindexed, 50):7.1f} ms p90 {percentile(unindexed, 90):7.1f} ms")
PY
