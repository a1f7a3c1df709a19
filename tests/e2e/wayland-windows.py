#!/usr/bin/python3
"""End-to-end: the agent on a headless Wayland compositor started here (weston's headless
backend, a socket of its own, no X display). The client side of the protocol (WAYLAND_DEBUG)
must show each window mapped as an xdg toplevel with a title of its own (not the program's name
nor an untranslated key), the agent's application id and a fixed size (minimum == maximum), a
buffer attached. Both questions are answered by withdrawal: their client is killed, the alert
goes away, and the next request is served. A download that asks nothing shows the progress
window, and its reply says Result 1 once the held transfer is released; a font whose file is
missing brings the download error alert, withdrawn in turn. Skipped (77) without weston.

usage: wayland-windows.py AGENT GLYPHWELL"""
import os
import re
import shutil
import sys

sys.dont_write_bytecode = True  # no cache files in the source tree
sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from e2e_support import (CANDIDATE_FONT, DOWNLOAD_NAME, MISSING_NAME, Failure, Run,  # noqa: E402
                         check_running, main, skip, stop, wait_for)

REQUEST = re.compile(r"-> (\w+)@(\d+)\.(\w+)\((.*)\)\s*$")
NEW_ID = re.compile(r"new id (\w+)@(\d+)")


class ProtocolLog:
    """The xdg toplevels that a WAYLAND_DEBUG=client log shows the client creating, in order,
    read as the log grows: title, application id, minimum and maximum size, whether a buffer was
    attached to its surface while it lived, and whether it was destroyed."""

    def __init__(self, path):
        self.path, self.offset, self.partial = path, 0, b""
        self.shell_surfaces = {}  # xdg_surface id -> wl_surface id
        self.live = {}  # xdg_toplevel id -> its record
        self.on_surface = {}  # wl_surface id -> the record of the toplevel living on it
        self.toplevels = []

    def update(self):
        """Reads the lines added since the last call; returns every toplevel so far."""
        with open(self.path, "rb") as log:
            log.seek(self.offset)
            data = log.read()
        self.offset += len(data)
        lines = (self.partial + data).split(b"\n")
        self.partial = lines.pop()
        for line in lines:
            match = REQUEST.search(line.decode("utf-8", "replace"))
            if match:
                self.request(*match.groups())
        return self.toplevels

    def request(self, interface, object_id, request, arguments):
        new = NEW_ID.search(arguments)
        if interface == "xdg_wm_base" and request == "get_xdg_surface" and new:
            surface = re.search(r"wl_surface@(\d+)", arguments).group(1)
            self.shell_surfaces[new.group(2)] = surface
        elif interface == "xdg_surface" and request == "get_toplevel" and new:
            record = dict(title=None, app_id=None, min=None, max=None, mapped=False,
                          destroyed=False, surface=self.shell_surfaces.get(object_id))
            self.live[new.group(2)] = record
            self.on_surface[record["surface"]] = record
            self.toplevels.append(record)
        elif interface == "xdg_toplevel" and object_id in self.live:
            record = self.live[object_id]
            if request in ("set_title", "set_app_id"):
                record[request[4:]] = arguments[1:-1]  # the quoted string
            elif request in ("set_min_size", "set_max_size"):
                record[request[4:7]] = tuple(int(n) for n in arguments.split(","))
            elif request == "destroy":
                record["destroyed"] = True
                del self.live[object_id]
                self.on_surface.pop(record["surface"], None)
        elif interface == "wl_surface" and request == "attach" and object_id in self.on_surface:
            if not arguments.startswith("nil"):
                self.on_surface[object_id]["mapped"] = True


def check_window(record, kind, title=None):
    """Fails unless the toplevel has its own title (`title` when given; Qt may append the
    application's display name after a dash), the agent's application id and a fixed size."""
    print(f"{kind}: {record}")
    if not record["mapped"]:
        raise Failure(f"the {kind} was never given a buffer")
    own = (record["title"] or "").split(" \u2014 ")[0]
    if own in ("", "GlyphwellUIAgent", "Glyphwell") or own.startswith("QZ_") or \
            (title and own != title):
        raise Failure(f"the {kind} is titled {record['title']!r}, not with a title of its own"
                      + (f" ({title!r})" if title else ""))
    if record["app_id"] != "org.glyphwell.Glyphwell.GlyphwellUIAgent":
        raise Failure(f"the {kind} has the application id {record['app_id']!r}")
    if not record["min"] or 0 in record["min"] or record["min"] != record["max"]:
        raise Failure(f"the {kind} has no fixed size: minimum {record['min']}, "
                      f"maximum {record['max']}")


def has_default_route():
    with open("/proc/net/route") as routes:
        return any(line.split()[1] == "00000000" for line in list(routes)[1:])


def test(agent, tool):
    weston = shutil.which("weston")
    if not weston:
        skip("weston is not installed (scripts/install-deps installs it)")
    with Run("wayland") as run:
        socket_name = f"glyphwell-e2e-{os.getpid()}"
        run.start("weston", [weston, "--backend=headless-backend.so", f"--socket={socket_name}",
                             "--idle-time=0", "--use-pixman", "--no-config",
                             "--width=1024", "--height=768"])
        wait_for("weston's socket", lambda: os.path.exists(os.path.join(run.runtime, socket_name)))

        env = dict(run.env, QT_QPA_PLATFORM="wayland", WAYLAND_DISPLAY=socket_name,
                   WAYLAND_DEBUG="client")
        env.pop("DISPLAY", None)
        agent_process = run.start_agent(agent, env)
        server = run.serve_download_font()

        log = ProtocolLog(run.path("agent.log"))

        def next_toplevel(seen, done=lambda record: record["mapped"]):
            """Waits for a toplevel beyond the first `seen` ones to satisfy `done`."""
            def ready():
                found = log.update()
                return len(found) > seen and done(found[seen]) and found
            return wait_for(f"window {seen + 1} to map", ready)

        # The two questions, each withdrawn by killing its client once the alert is mapped.
        questions = [
            ("activation", ["ask-activation", "--candidate", CANDIDATE_FONT, "--app", "Demo"]),
            ("download", ["ask-download", "--font", f"{DOWNLOAD_NAME}:DejaVu Serif",
                          "--app", "Demo"]),
        ]
        seen = 0
        for name, arguments in questions:
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
        server.release()
        result, _ = run.reply(client, "progress")
        if result != 1:
            raise Failure(f"the download's Result is {result}, not 1")

        # A font that fails: after its progress window, the error alert, withdrawn.
        client = run.ask(tool, "failure", "ask-download", "--font", MISSING_NAME, "--suppress",
                         "--app", "Demo")
        found = next_toplevel(len(found) + 1)
        check_window(found[-1], "download error alert")
        stop(client)
        next_toplevel(len(found) - 1, lambda record: record["destroyed"])
        check_running(agent_process)


if __name__ == "__main__":
    if len(sys.argv) != 3:
        sys.exit(__doc__.splitlines()[-1])
    main(lambda: test(*sys.argv[1:]))
