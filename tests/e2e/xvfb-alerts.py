#!/usr/bin/python3
"""End-to-end: both questions asked on a private X server and answered with Return, as a user
would: the default buttons Allow (message id 1, Result 1) and Skip (message id 2, Result 0).
Skipped (77) without Xvfb or xdotool.

usage: xvfb-alerts.py AGENT GLYPHWELL"""
import os
import subprocess
import sys

sys.dont_write_bytecode = True  # no cache files in the source tree
sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from e2e_support import (QUESTIONS, Run, check, check_running, main, require,  # noqa: E402
                         start_xvfb, wait_for)


def test(agent, tool):
    require("Xvfb", "xdotool")
    with Run("xvfb") as run:
        run.env.update(DISPLAY=start_xvfb(run), QT_QPA_PLATFORM="xcb")
        run.env.pop("WAYLAND_DISPLAY", None)
        agent_process = run.start_agent(agent)
        run.serve_download_font()

        def xdotool(*arguments):
            return subprocess.run(["xdotool", *arguments], env=run.env, capture_output=True,
                                  text=True, timeout=5).stdout.split()

        # Return presses the default button: Allow (Result 1), then Skip (Result 0).
        previous = None
        for (name, arguments), expected in zip(QUESTIONS, (1, 0)):
            client = run.ask(tool, name, *arguments)
            # The alert: a visible agent window other than the previous alert (hidden by now).
            window = wait_for(f"the {name} alert", lambda: next(
                (found for found in xdotool("search", "--onlyvisible", "--pid",
                                            str(agent_process.pid)) if found != previous), None))
            previous = window

            def answered():
                # Keys are dropped for a second after the alert shows: Return until it answers.
                xdotool("windowfocus", "--sync", window)
                xdotool("key", "--clearmodifiers", "Return")
                try:
                    return client.wait(0.3) is not None
                except subprocess.TimeoutExpired:
                    return False

            wait_for(f"the {name} alert to take Return", answered, timeout=15)
            result, _ = run.reply(client, name)
            check(result == expected, f"the {name} reply's Result is {result}, not {expected}")
        check_running(agent_process)


if __name__ == "__main__":
    main(test, __doc__)
