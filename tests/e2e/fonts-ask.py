#!/usr/bin/python3
"""End-to-end: `glyphwell fonts --ask` on a DOCX whose font the catalog offers. The agent asks on
a private X server, Download is chosen with the keyboard once its 1 s input guard is over, the
font is downloaded from a loopback server and installed, and the tool then reports it installed.
Skipped (77) without Xvfb or xdotool.

usage: fonts-ask.py AGENT GLYPHWELL"""
import hashlib
import json
import os
import subprocess
import sys
import time

sys.dont_write_bytecode = True  # no cache files in the source tree
sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from e2e_support import (Failure, FontServer, Run, check, main, require, start_xvfb,  # noqa: E402
                         wait_for)

SOURCE = os.path.dirname(os.path.dirname(os.path.dirname(os.path.abspath(__file__))))
DOCUMENT = os.path.join(SOURCE, "tests", "documents", "fixtures", "sample.docx")
OFFERED = "/usr/share/fonts/truetype/dejavu/DejaVuSerif.ttf"


def states(run, tool, *options):
    """The tool's JSON report of DOCUMENT: {name: state}, and its exit status."""
    done = subprocess.run([tool, "fonts", "--json", *options, DOCUMENT], env=run.env,
                          capture_output=True, text=True, timeout=120)
    fonts = json.loads(done.stdout)["files"][0]["fonts"]
    return {font["name"]: font["state"] for font in fonts}, done.returncode


def test(agent, tool):
    require("Xvfb", "xdotool")
    with Run("fonts") as run:
        # The document's DejaVu Serif is hidden from fontconfig and offered by the catalog. The
        # system's fonts are listed without its configuration files, one of which leaks inside
        # fontconfig 2.14 and would change the sanitized tool's exit status.
        with open(run.path("fonts.conf"), "w") as f:
            f.write('<?xml version="1.0"?>\n<!DOCTYPE fontconfig SYSTEM "fonts.dtd">\n'
                    "<fontconfig><dir>/usr/share/fonts</dir><dir prefix=\"xdg\">fonts</dir>\n"
                    f"<cachedir>{run.path('cache')}/fontconfig</cachedir>"
                    "<selectfont><rejectfont><glob>/usr/share/fonts/truetype/dejavu/DejaVuSerif*"
                    "</glob></rejectfont></selectfont></fontconfig>\n")
        run.server = server = FontServer(OFFERED)
        server.released.set()
        with open(run.path("data/glyphwell/downloadable-fonts.json"), "w") as f:
            json.dump({"assets": [{
                "LocalID": "org.glyphwell.e2e.DejaVuSerif", "url": server.url,
                "size": len(server.body), "sha256": hashlib.sha256(server.body).hexdigest(),
                "fonts": [{"postScriptName": "DejaVuSerif", "family": "DejaVu Serif"}]}]}, f)
        before, _ = states(run, tool)
        check(before.get("DejaVu Serif") == "offered", f"before: {before}")

        run.env.update(DISPLAY=start_xvfb(run), QT_QPA_PLATFORM="xcb")
        run.env.pop("WAYLAND_DISPLAY", None)
        agent_process = run.start_agent(agent)
        with open(run.path("ask.out"), "wb") as out:
            client = subprocess.Popen([tool, "fonts", "--json", "--ask", "--app", "Writer",
                                       DOCUMENT], env=run.env, stdout=out,
                                      stderr=subprocess.PIPE)
        run.processes.append(client)

        def xdotool(*arguments):
            return subprocess.run(["xdotool", *arguments], env=run.env, capture_output=True,
                                  text=True, timeout=5).stdout.split()

        window = wait_for("the download alert", lambda: next(iter(
            xdotool("search", "--onlyvisible", "--pid", str(agent_process.pid))), None))

        # The alert takes no key for 1 s after it shows; then, once: Skip is the default button,
        # Shift+Tab moves to Download, space presses it.
        time.sleep(1.5)
        xdotool("windowfocus", "--sync", window)
        xdotool("key", "--clearmodifiers", "shift+Tab", "space")
        wait_for("the alert to take Download", lambda: window not in xdotool(
            "search", "--onlyvisible", "--pid", str(agent_process.pid)), timeout=15)
        try:
            errors = client.communicate(timeout=60)[1].decode(errors="replace")
        except subprocess.TimeoutExpired:
            raise Failure("glyphwell fonts --ask did not end") from None
        status = client.returncode
        check("Sanitizer" not in errors, f"glyphwell fonts --ask: {errors}")
        report = json.loads(run.read("ask.out"))["files"][0]["fonts"]
        after = {font["name"]: font["state"] for font in report}
        print(f"after --ask: {after} (exit {status})")
        check(after.get("DejaVu Serif") == "installed", f"after --ask: {after}")
        check(status == 1, f"exit status {status}, not 1 (other fonts stay missing)")
        again, _ = states(run, tool)
        check(again.get("DejaVu Serif") == "installed", f"a new run: {again}")


if __name__ == "__main__":
    main(test, __doc__)
