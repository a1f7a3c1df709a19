#!/usr/bin/python3
"""End-to-end: the agent driven through the accessibility bus, as a screen reader user would,
on a private X server and session bus: the alerts read (no bare translation key), the countdown a
status region, the help a document; Allow with "don't ask again" replies Result 1, Suppress 1;
Cancel in the progress window, the transfer held, Result 0. Skipped (77) without Xvfb,
dbus-run-session, at-spi2-core or pyatspi.

usage: accessibility.py AGENT GLYPHWELL"""
import importlib.util
import os
import re
import sys

sys.dont_write_bytecode = True  # no cache files in the source tree
sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from e2e_support import (CANDIDATE_FONT, DOWNLOAD_NAME, Run, check,  # noqa: E402
                         check_running, main, require, skip, start_xvfb, wait_for)

PRIVATE_BUS = "GLYPHWELL_E2E_PRIVATE_BUS"


class Tree:
    """Finders over the accessible tree of process `pid`; None when a window went while walked."""

    def __init__(self, pyatspi, pid):
        from gi.repository import GLib
        self.atspi, self.pid, self.gone, self.app = pyatspi, pid, GLib.Error, None

    def showing(self, node):
        return node is not None and node.getState().contains(self.atspi.STATE_SHOWING)

    def window(self, roles=None, containing=None):
        """A showing top-level window with one of `roles` (None: any) holding `containing`."""
        try:
            if self.app is None:
                self.app = next((app for app in self.atspi.Registry.getDesktop(0)
                                 if app is not None and app.get_process_id() == self.pid), None)
            for window in self.app or []:
                if self.showing(window) and (roles is None or window.getRole() in roles) and (
                        containing is None or self.find(containing, within=window)):
                    return window
        except self.gone:
            pass
        return None

    def find(self, role, name=None, within=None):
        try:
            return self.atspi.findDescendant(within, lambda n: n is not None and (
                n.getRole() == role and (name is None or n.name == name) and self.showing(n)))
        except self.gone:
            return None

    def press(self, name, within):
        self.act(wait_for(f"the {name} button",
                          lambda: self.find(self.atspi.ROLE_PUSH_BUTTON, name, within)), "Press")

    def texts(self, window):
        """The labels' names in `window`; fails on a bare translation key anywhere in it."""
        try:
            nodes = [window, *self.atspi.findAllDescendants(window, lambda n: n is not None)]
            names = [(node.getRole(), node.name) for node in nodes]
        except self.gone:
            return None
        keys = [name for _, name in names if name.startswith("QZ_")]
        check(not keys, f"no table covers the texts {keys}")
        return [name for role, name in names if role == self.atspi.ROLE_LABEL]

    def act(self, node, action):
        wait_for(f"{node.name!r} to be enabled", lambda: all(
            node.getState().contains(state)
            for state in (self.atspi.STATE_ENABLED, self.atspi.STATE_SENSITIVE)), timeout=10)
        actions = node.queryAction()
        names = [actions.getName(i) for i in range(actions.nActions)]
        check(action in names, f"{node.name!r} offers {names}, not {action}")
        actions.doAction(names.index(action))


def test(agent, tool):
    import pyatspi

    with Run("accessibility") as run:
        # Asking for the desktop starts the accessibility bus before the agent looks for it.
        pyatspi.Registry.getDesktop(0)
        agent_process = run.start_agent(agent, DISPLAY=start_xvfb(run), QT_QPA_PLATFORM="xcb",
                                        WAYLAND_DISPLAY=None, QT_LINUX_ACCESSIBILITY_ALWAYS_ON="1")
        server = run.serve_download_font()
        tree = Tree(pyatspi, agent_process.pid)
        alerts = (pyatspi.ROLE_ALERT,)

        # Message id 1: read, the countdown a status region; "don't ask again" toggled, the help
        # opened as a readable document, Allow pressed.
        client = run.ask(tool, "activation", "ask-activation", "--candidate", CANDIDATE_FONT,
                         "--font", "DejaVu Serif", "--app", "Demo Editor")
        alert = wait_for("the activation alert", lambda: tree.window(alerts))
        words = wait_for("the alert's texts", lambda: tree.texts(alert))
        print(f"activation alert says: {words}")
        check(any("Demo Editor" in text and "DejaVu Serif" in text for text in words),
              "no text of the alert names the application and the font")
        check_box = tree.find(pyatspi.ROLE_CHECK_BOX, within=alert)
        countdown = tree.find(pyatspi.ROLE_STATUS_BAR, within=alert)
        check(check_box and countdown, "the alert lacks its checkbox or its status region")
        check(re.search(r"\b[0-2]:[0-5]\d\b", countdown.name),
              f"the countdown says {countdown.name!r}, not the time left")
        tree.act(check_box, "Toggle")
        wait_for("the checkbox to be checked",
                 lambda: check_box.getState().contains(pyatspi.STATE_CHECKED), timeout=10)
        tree.press("Help", alert)
        documents = (pyatspi.ROLE_DOCUMENT_FRAME, pyatspi.ROLE_DOCUMENT_TEXT,
                     pyatspi.ROLE_DOCUMENT_WEB)
        document = wait_for("the help document", lambda: tree.window(documents))
        check(document.queryText().characterCount, "the help document has no text to read")
        tree.press("Allow", alert)
        check(run.reply(client, "activation") == (1, 1),
              "Allow with \"don't ask again\" did not reply Result 1, Suppress 1")

        # Message id 2: Download pressed; then Cancel in the progress window, the transfer held.
        client = run.ask(tool, "download", "ask-download", "--font",
                         f"{DOWNLOAD_NAME}:DejaVu Serif", "--app", "Demo Editor")
        alert = wait_for("the download alert", lambda: tree.window(alerts))
        print(f"download alert says: {wait_for('its texts', lambda: tree.texts(alert))}")
        tree.press("Download", alert)

        def progress_window():
            """The progress window once it shows; offline, the alert before it is continued."""
            offline = tree.window(alerts)
            go_on = offline and tree.find(pyatspi.ROLE_PUSH_BUTTON, "Continue Download", offline)
            if go_on:
                tree.act(go_on, "Press")
            return tree.window(containing=pyatspi.ROLE_PROGRESS_BAR)

        window = wait_for("the progress window", progress_window)
        wait_for("the font request", server.started.is_set)
        bar = tree.find(pyatspi.ROLE_PROGRESS_BAR, within=window)
        check(bar.name and not bar.name.startswith("QZ_"),
              f"the progress bar is named {bar.name!r}")
        tree.press("Cancel", window)
        check(run.reply(client, "download")[0] == 0,
              "Cancel in the progress window did not reply Result 0")
        left = [name for _, _, files in os.walk(run.path("home")) for name in files]
        check(not left, f"the cancelled download left {left} behind")
        check_running(agent_process)


if __name__ == "__main__":
    if os.environ.get(PRIVATE_BUS) != "1" and len(sys.argv) == 3:
        require("Xvfb", "dbus-run-session")
        if not any(os.path.exists(os.path.join(folder, "at-spi-bus-launcher"))
                   for folder in ("/usr/libexec", "/usr/lib/at-spi2-core")):
            skip("at-spi2-core is not installed")
        if importlib.util.find_spec("pyatspi") is None:
            skip("python3-pyatspi is not installed")
        # A private session bus (and so a private accessibility bus) for this run alone.
        os.environ[PRIVATE_BUS] = "1"
        os.execvp("dbus-run-session", ["dbus-run-session", "--", sys.executable,
                                       os.path.abspath(__file__), *sys.argv[1:]])
    main(test, __doc__)
