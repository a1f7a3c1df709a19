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

python3 - "$agent" "$runs" <<'PY'
import math, os, signal, socket, struct, subprocess, sys, tempfile, time

agent, runs = sys.argv[1], int(sys.argv[2])
port_name = "org.glyphwell.Glyphwell.GlyphwellUIAgent"

def start():
    runtime = tempfile.mkdtemp(prefix="glyphwell-bench-")
    os.chmod(runtime, 0o700)
    path = os.path.join(runtime, port_name)
    env = dict(os.environ, XDG_RUNTIME_DIR=runtime)
    started = time.monotonic_ns()
    proc = subprocess.Popen([agent], env=env, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
    sock = None
    deadline = started + 10 * 10**9
    while time.monotonic_ns() < deadline:
        s = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        try:
            s.connect(path)
            sock = s
            break
        except OSError:
            s.close()
            time.sleep(0.0005)
    if sock is None:
        proc.kill(); proc.wait()
        sys.exit("the agent did not open its port within 10 s")
    connected = time.monotonic_ns()
    sock.sendall(struct.pack(">iI", 3, 0))  # unknown message id, empty body
    header = b""
    while len(header) < 4:
        chunk = sock.recv(4 - len(header))
        if not chunk:
            sys.exit("the agent closed the connection without a reply")
        header += chunk
    replied = time.monotonic_ns()
    sock.close()
    return proc, runtime, (connected - started) / 1e6, (replied - started) / 1e6

def stop(proc, runtime):
    proc.send_signal(signal.SIGTERM)
    try:
        proc.wait(timeout=5)
    except subprocess.TimeoutExpired:
        proc.kill(); proc.wait()
    for name in os.listdir(runtime):
        os.unlink(os.path.join(runtime, name))
    os.rmdir(runtime)

def percentile(values, p):
    ordered = sorted(values)
    # Nearest rank: the smallest value with at least p % of the values at or below it.
    return ordered[max(0, math.ceil(p / 100 * len(ordered)) - 1)]

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
