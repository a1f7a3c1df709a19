#!/usr/bin/python3
"""glyphwell-bus-bridge: idle resident memory and wake-ups, the reply latency of 1,000
InstallFontconfigResources calls (p50, p99), and the time from a call to the agent's question
window. Private session bus, X server and fontconfig, as in tests/e2e/bus-bridge.py; figures go
to bench/RESULTS.md.

usage: bus_bridge_bench.py BRIDGE [AGENT GLYPHWELL]"""
import os
import subprocess
import sys
import time

sys.dont_write_bytecode = True
sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), "..", "tests", "e2e"))
from e2e_support import FontServer, Run, start_xvfb, wait_for  # noqa: E402

NAME, PATH = "org.freedesktop.PackageKit", "/org/freedesktop/PackageKit"
# One connection, `count` blocking calls timed one by one, as LibreOffice makes them; then one
# more after which the caller waits, printing the time of that call's reply.
CLIENT = f"""
import sys, time
from gi.repository import Gio, GLib
bus = Gio.bus_get_sync(Gio.BusType.SESSION)
args = GLib.Variant("(asssa{{sv}})", (sys.argv[2].split("|"), "hide-finished", "", {{}}))
times = []
print("start", time.monotonic(), flush=True)
for _ in range(int(sys.argv[1])):
    start = time.perf_counter()
    bus.call_sync("{NAME}", "{PATH}", "{NAME}.Modify2", "InstallFontconfigResources", args, None,
                  Gio.DBusCallFlags.NONE, 25000, None)
    times.append(time.perf_counter() - start)
times.sort()
print("times", " ".join(f"{{t * 1000:.3f}}" for t in times), flush=True)
GLib.MainLoop().run()
"""


def status(pid, field):
    with open(f"/proc/{pid}/status") as f:
        return next(int(line.split()[1]) for line in f if line.startswith(field + ":"))


def at_rest(pid):
    """VmRSS, VmHWM, Pss and private memory once the bridge's font-choice workers have ended."""
    wait_for("the workers to end", lambda: not open(f"/proc/{pid}/task/{pid}/children").read())
    time.sleep(2)
    with open(f"/proc/{pid}/smaps_rollup") as f:
        rollup = {line.split(":")[0]: int(line.split()[1]) for line in f if line.endswith("kB\n")}
    return (f"VmRSS {status(pid, 'VmRSS')} KiB, VmHWM {status(pid, 'VmHWM')} KiB, Pss "
            f"{rollup['Pss']} KiB, private {rollup['Private_Clean'] + rollup['Private_Dirty']} KiB")


def main(bridge, agent=None, tool=None):
    with Run("bridge-bench") as run:
        os.makedirs(run.path("home/fonts"))
        with open(run.path("fonts.conf"), "w") as f:
            f.write(f'<?xml version="1.0"?>\n<fontconfig><dir>/usr/share/fonts/truetype/dejavu'
                    f'</dir><dir>{run.path("home/fonts")}</dir><cachedir>{run.path("cache")}'
                    '</cachedir></fontconfig>\n')
        run.env.update(XDG_DATA_DIRS=run.path("data"), XDG_STATE_HOME=run.path("state"),
                       GLYPHWELL_INPUT_GUARD_MS="0", QT_QPA_PLATFORM="xcb")
        run.start_session_bus()
        # Start-up: exec to the name owned, asked of the bus in a tight loop, 10 starts.
        from gi.repository import Gio, GLib
        os.environ["DBUS_SESSION_BUS_ADDRESS"] = run.env["DBUS_SESSION_BUS_ADDRESS"]
        bus = Gio.bus_get_sync(Gio.BusType.SESSION)

        def owned():
            return bus.call_sync("org.freedesktop.DBus", "/org/freedesktop/DBus",
                                 "org.freedesktop.DBus", "NameHasOwner", GLib.Variant(
                                     "(s)", (NAME,)), None, 0, 1000, None).unpack()[0]

        starts = []
        for _ in range(10):
            start = time.monotonic()
            starting = subprocess.Popen([bridge], env=run.env, stderr=subprocess.DEVNULL)
            while not owned():
                pass
            starts.append((time.monotonic() - start) * 1000)
            starting.terminate()
            starting.wait()
            while owned():
                pass
        starts.sort()
        print(f"exec to name owned, 10 starts: median {starts[5]:.1f} ms, max {starts[-1]:.1f} ms")
        process = run.start("bridge", [bridge])
        print(f"at rest after start: {at_rest(process.pid)}")
        switches = status(process.pid, "voluntary_ctxt_switches")
        time.sleep(10)
        print(f"wake-ups in 10 s idle: "
              f"{status(process.pid, 'voluntary_ctxt_switches') - switches}")
        monitor = run.start("monitor", ["gdbus", "monitor", "--session", "--dest", NAME])
        time.sleep(1)
        print(f"reference, `gdbus monitor` idle (GDBus): VmRSS {status(monitor.pid, 'VmRSS')} KiB")

        client = run.start("latency", ["/usr/bin/python3", "-c", CLIENT, "1000", ":lang=en"])
        line = wait_for("the calls", lambda: next((line for line in run.read(
            "latency.log").splitlines() if line.startswith("times ")), None), timeout=120)
        times = [float(t) for t in line.split()[1:]]
        print(f"reply latency over {len(times)} calls: p50 {times[len(times) // 2]:.3f} ms, "
              f"p99 {times[int(len(times) * 0.99)]:.3f} ms, max {times[-1]:.3f} ms")
        client.kill()
        time.sleep(1)  # the burst ends; its worker chooses (nothing: en is installed) and ends
        print(f"at rest after the 1,000 calls: {at_rest(process.pid)}")
        if not agent:
            return
        run.server = FontServer("/usr/share/fonts/truetype/wqy/wqy-microhei.ttc")
        subprocess.run([tool, "catalog", "add", "/usr/share/fonts/truetype/wqy/wqy-microhei.ttc",
                        "--url-prefix", run.server.url.rsplit("/", 1)[0], "--catalog",
                        run.path("data/glyphwell/downloadable-fonts.json")],
                       env=run.env, check=True, capture_output=True)
        run.env["DISPLAY"] = start_xvfb(run)
        agent_process = run.start_agent(agent)
        for round in range(5):
            asker = run.start(f"ask{round}", ["/usr/bin/python3", "-c", CLIENT, "1", ":lang=ja"])
            window = wait_for("the question", lambda: subprocess.run(
                ["xdotool", "search", "--onlyvisible", "--pid", str(agent_process.pid)],
                env=run.env, capture_output=True, text=True).stdout.split(), timeout=30)
            shown = time.monotonic()
            start = float(run.read(f"ask{round}.log").split()[1])
            print(f"call to question window: {(shown - start) * 1000:.0f} ms "
                  f"(of which the 1 s burst window)")
            asker.kill()
            wait_for("the question to go", lambda: not subprocess.run(
                ["xdotool", "search", "--onlyvisible", "--pid", str(agent_process.pid)],
                env=run.env, capture_output=True, text=True).stdout.split())
            del window
        print(f"at rest after five questions (each chosen and asked by a worker): "
              f"{at_rest(process.pid)}")


if __name__ == "__main__":
    if len(sys.argv) not in (2, 4):
        sys.exit(__doc__.splitlines()[-1])
    main(*sys.argv[1:])
