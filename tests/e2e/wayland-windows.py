#!/usr/bin/python3
"""End-to-end: the agent on a private headless weston. Its protocol log (WAYLAND_DEBUG) must show
each window as a mapped xdg toplevel with a title of its own, the agent's application id and a
fixed size: both alerts, withdrawn by killing their client; the progress window of an unasked
download (Result 1); the error alert of a missing font. Skipped (77) without weston.

usage: wayland-windows.py AGENT GLYPHWELL"""
import os
import re
import sys

sys.dont_write_bytecode = True  # no cache files in the source tree
sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from e2e_support import (DOWNLOAD_NAME, MISSING_NAME, QUESTIONS, Run, check,  # noqa: E402
                         check_running, main, require, stop, wait_for)

REQUEST = re.compile(r"-> (\w+)@(\d+)\.(\w+)\((.*)\)\s*$")
NEW_ID = re.compile(r"new id (\w+)@(\d+)")


def toplevels(path):
    """The xdg toplevels of a WAYLAND_DEBUG=client log in order: title, application id, minimum
    and maximum size, whether its surface got a buffer while it lived, whether it was destroyed."""
    shell_surfaces, live, on_surface, found = {}, {}, {}, []  # by xdg_surface, toplevel, surface
    with open(path, encoding="utf-8", errors="replace") as log:
        lines = log.read().split("\n")[:-1]  # the last piece may be a partial line
    for interface, object_id, request, arguments in (
            match.groups() for match in map(REQUEST.search, lines) if match):
        new = NEW_ID.search(arguments)
        if interface == "xdg_wm_base" and request == "get_xdg_surface" and new:
            shell_surfaces[new.group(2)] = re.search(r"wl_surface@(\d+)", arguments).group(1)
        elif interface == "xdg_surface" and request == "get_toplevel" and new:
            record = dict(title=None, app_id=None, min=None, max=None, mapped=False,
                          destroyed=False, surface=shell_surfaces.get(object_id))
            live[new.group(2)] = on_surface[record["surface"]] = record
            found.append(record)
        elif interface == "xdg_toplevel" and object_id in live:
            record = live[object_id]
            if request in ("set_title", "set_app_id"):
                record[request[4:]] = arguments[1:-1]  # the quoted string
            elif request in ("set_min_size", "set_max_size"):
                record[request[4:7]] = tuple(int(n) for n in arguments.split(","))
            elif request == "destroy":
                record["destroyed"] = True
                del live[object_id]
                on_surface.pop(record["surface"], None)
        elif interface == "wl_surface" and request == "attach" and object_id in on_surface \
                and not arguments.startswith("nil"):
            on_surface[object_id]["mapped"] = True
    return found


def check_window(record, kind, title=None):
    """Fails unless the toplevel has its own title (`title` when given; Qt may append the
    application's name after a dash), the agent's application id and a fixed size."""
    print(f"{kind}: {record}")
    check(record["mapped"], f"the {kind} was never given a buffer")
    own = (record["title"] or "").split(" \u2014 ")[0]
    check(own not in ("", "GlyphwellUIAgent", "Glyphwell") and not own.startswith("QZ_") and
          (not title or own == title), f"the {kind} is titled {record['title']!r}, not with a "
          "title of its own" + (f" ({title!r})" if title else ""))
    check(record["app_id"] == "org.glyphwell.Glyphwell.GlyphwellUIAgent",
          f"the {kind} has the application id {record['app_id']!r}")
    check(record["min"] and 0 not in record["min"] and record["min"] == record["max"],
          f"the {kind} has no fixed size: minimum {record['min']}, maximum {record['max']}")


def has_default_route():
    with open("/proc/net/route") as routes:
        return any(line.split()[1] == "00000000" for line in list(routes)[1:])


def test(agent, tool):
    require("weston")
    with Run("wayland") as run:
        socket_name = f"glyphwell-e2e-{os.getpid()}"
        run.start("weston", ["weston", "--backend=headless-backend.so", f"--socket={socket_name}",
                             "--idle-time=0", "--use-pixman", "--no-config",
                             "--width=1024", "--height=768"])
        wait_for("weston's socket", lambda: os.path.exists(os.path.join(run.runtime, socket_name)))

        agent_process = run.start_agent(agent, QT_QPA_PLATFORM="wayland", DISPLAY=None,
                                        WAYLAND_DISPLAY=socket_name, WAYLAND_DEBUG="client")
        server = run.serve_download_font()

        def next_toplevel(seen, done=lambda record: record["mapped"]):
            def ready():
                found = toplevels(run.path("agent.log"))
                return len(found) > seen and done(found[seen]) and found
            return wait_for(f"window {seen + 1} to map", ready)

        # The two questions, each withdrawn by killing its client once the alert is mapped.
        seen = 0
        for name, arguments in QUESTIONS:
            client = run.ask(tool, name, *arguments)
            check_window(next_toplevel(seen)[seen], f"{name} alert")
            stop(client)
            next_toplevel(seen, lambda record: record["destroyed"])
            seen += 1

        # Nothing asked: the progress window follows the transfer, held until it is seen.
        # Offline, an alert would come first, which nothing here can answer.
        if not has_default_route():
            print("no default route: the progress window is not checked")
            return
        client = run.ask(tool, "progress", "ask-download", "--font", DOWNLOAD_NAME, "--suppress",
                         "--app", "Demo")
        wait_for("the font request", server.started.is_set)
        found = next_toplevel(seen)
        check_window(found[-1], "progress window", "Font Download")
        server.released.set()
        result, _ = run.reply(client, "progress")
        check(result == 1, f"the download's Result is {result}, not 1")

        # A font that fails: after its progress window, the error alert, withdrawn.
        client = run.ask(tool, "failure", "ask-download", "--font", MISSING_NAME, "--suppress",
                         "--app", "Demo")
        found = next_toplevel(len(found) + 1)
        check_window(found[-1], "download error alert", "Font Download Failed")
        stop(client)
        next_toplevel(len(found) - 1, lambda record: record["destroyed"])
        check_running(agent_process)


if __name__ == "__main__":
    main(test, __doc__)
