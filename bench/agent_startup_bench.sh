#!/usr/bin/env bash
# The agent's start-up and idle footprint, on Qt's offscreen platform:
#   - port ready: from just before exec to the first successful connect to the agent's socket,
#     and to the first reply (an empty request for unknown message id 3), over N starts
#     (default 20); median and 90th percentile;
#   - idle resident memory: VmRSS from /proc/<pid>/status 2 s after the first reply, over 3 starts.
# Each start uses a fresh runtime directory; the agent is ended with SIGTERM after each one.
#
# usage: bench/agent_startup_bench.sh AGENT [N]   (AGENT from a Release build)
set -euo pipefail

agent=${1:?usage: agent_startup_bench.sh AGENT [N]}
runs=${2:-20}
export QT_QPA_PLATFORM=offscreen

python3 - "$agent" "$runs" "$(dirname "$0")" <<'PY'
import os, sys, tempfile, time

agent, runs = sys.argv[1], int(sys.argv[2])
sys.dont_write_bytecode = True  # no cache files in the source tree
sys.path.insert(0, sys.argv[3])
from agent_port import percentile, start_and_ask, stop as stop_agent  # noqa: E402

def start():
    runtime = tempfile.mkdtemp(prefix="glyphwell-bench-")
    os.chmod(runtime, 0o700)
    env = dict(os.environ, XDG_RUNTIME_DIR=runtime)
    proc, connect_ms, reply_ms = start_and_ask(agent, env, 3, b"", 10)  # unknown message id
    return proc, runtime, connect_ms, reply_ms

def stop(proc, runtime):
    stop_agent(proc)
    for name in os.listdir(runtime):
        os.unlink(os.path.join(runtime, name))
    os.rmdir(runtime)

# One warm-up start (file cache, fontconfig cache) that is not counted.
stop(*start()[:2])
connects, replies = [], []
for _ in range(runs):
    proc, runtime, connect_ms, reply_ms = start()
    connects.append(connect_ms); replies.append(reply_ms)
    stop(proc, runtime)

rss = []
for _ in range(3):
    proc, runtime, _, _ = start()
    time.sleep(2)
    with open(f"/proc/{proc.pid}/status") as f:
        for line in f:
            if line.startswith("VmRSS:"):
                rss.append(int(line.split()[1]) / 1024)
    stop(proc, runtime)

print(f"starts: {runs} (after one warm-up)")
for label, values in (("exec -> connect", connects), ("exec -> first reply", replies)):
    print(f"{label:22s} median {percentile(values, 50):7.1f} ms   p90 {percentile(values, 90):7.1f} ms"
          f"   min {min(values):7.1f} ms   max {max(values):7.1f} ms")
print("idle VmRSS 2 s after the first reply: " + ", ".join(f"{v:.1f}" for v in rss) + " MiB")
PY
