"""The agent started on its own runtime directory and timed to its first reply (for the benches
that measure a cold agent)."""
import math
import os
import signal
import socket
import struct
import subprocess
import sys
import time

PORT_NAME = "org.glyphwell.Glyphwell.GlyphwellUIAgent"


def start_and_ask(agent, env, msgid, body, timeout_s):
    """Starts `agent` with `env` (whose XDG_RUNTIME_DIR holds its port) and sends it one request.
    Returns the process and the milliseconds from just before exec to the first connect and to the
    reply's header. Exits the program when the agent does not answer."""
    path = os.path.join(env["XDG_RUNTIME_DIR"], PORT_NAME)
    started = time.monotonic_ns()
    proc = subprocess.Popen([agent], env=env, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
    deadline = started + timeout_s * 10**9
    sock = None
    while sock is None and time.monotonic_ns() < deadline:
        s = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        try:
            s.connect(path)
            sock = s
        except OSError:
            s.close()
            time.sleep(0.0005)
    if sock is None:
        proc.kill(); proc.wait()
        sys.exit(f"the agent did not open its port within {timeout_s} s")
    connected = time.monotonic_ns()
    sock.sendall(struct.pack(">iI", msgid, len(body)) + body)
    header = b""
    while len(header) < 4:
        chunk = sock.recv(4 - len(header))
        if not chunk:
            sys.exit("the agent closed the connection without a reply")
        header += chunk
    replied = time.monotonic_ns()
    sock.close()
    return proc, (connected - started) / 1e6, (replied - started) / 1e6


def stop(proc):
    """Ends the agent with SIGTERM, killed when it has not ended within 5 s."""
    proc.send_signal(signal.SIGTERM)
    try:
        proc.wait(timeout=5)
    except subprocess.TimeoutExpired:
        proc.kill(); proc.wait()


def percentile(values, p):
    """Nearest rank: the smallest value with at least p % of the values at or below it."""
    ordered = sorted(values)
    return ordered[max(0, math.ceil(p / 100 * len(ordered)) - 1)]
