#!/usr/bin/python3
"""End-to-end: glyphwell-bus-bridge on a private session bus, with the real agent on a private X
server, a loopback font server and a private fontconfig without a Japanese font: the name left
to another provider, the replies callers get whatever they send, one question per burst, Skip
remembered, a quitting caller's question withdrawn, zenity's font-install module answered
Download (font installed, notified), broken choosers. Skipped (77) without Xvfb, xdotool,
dbus-daemon, gdbus, zenity or python3-gi.

usage: bus-bridge.py AGENT GLYPHWELL BRIDGE"""
import os
import shutil
import subprocess
import sys

sys.dont_write_bytecode = True  # no cache files in the source tree
sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from e2e_support import (FontServer, Run, check, main, require, skip,  # noqa: E402
                         start_xvfb, wait_for)

NAME, PATH = "org.freedesktop.PackageKit", "/org/freedesktop/PackageKit"
MODIFY2 = NAME + ".Modify2"
JAPANESE_FONT = "/usr/share/fonts/truetype/wqy/wqy-microhei.ttc"
APP_ID = "org.example.Reader.desktop"
# A GDBus client that stays alive after its calls, as applications do: argv[1] is "sync" (GetAll,
# then blocking calls, as LibreOffice does), "async" (one connection, calls not waited for, as
# the GTK module does) or "many:N" (as async, from each of N connections), argv[2] the desktop id,
# the rest one call's resources each, as a Python expression (lists too long for a command line).
CLIENT = f"""
import sys
from gi.repository import Gio, GLib
address = Gio.dbus_address_get_for_bus_sync(Gio.BusType.SESSION, None)
flags = (Gio.DBusConnectionFlags.AUTHENTICATION_CLIENT |
         Gio.DBusConnectionFlags.MESSAGE_BUS_CONNECTION)
buses = [Gio.DBusConnection.new_for_address_sync(address, flags, None, None)
         for _ in range(int(sys.argv[1][5:]) if sys.argv[1].startswith("many:") else 1)]
def call(method, args, sync):
    for bus in buses:
        run = bus.call_sync if sync else bus.call
        run("{NAME}", "{PATH}", method.rsplit(".", 1)[0], method.rsplit(".", 1)[1], args, None,
            Gio.DBusCallFlags.NONE, 25000, None, *([] if sync else [None]))
sync = sys.argv[1] == "sync"
if sync:
    call("org.freedesktop.DBus.Properties.GetAll", GLib.Variant("(s)", ("{MODIFY2}",)), True)
for resources in sys.argv[3:]:
    resources = eval(resources)
    call("{MODIFY2}.InstallFontconfigResources", GLib.Variant(
        "(asssa{{sv}})", (resources, "hide-finished", sys.argv[2], {{}})), sync)
print("sent", flush=True)
GLib.MainLoop().run()
"""
# A desktop notification server that prints each notification's summary and body.
NOTIFICATIONS = """
from gi.repository import Gio, GLib
def called(connection, sender, path, interface, method, args, invocation):
    print(args[3], "|", args[4], flush=True)
    invocation.return_value(GLib.Variant("(u)", (1,)))
bus = Gio.bus_get_sync(Gio.BusType.SESSION)
node = Gio.DBusNodeInfo.new_for_xml('<node><interface name="org.freedesktop.Notifications">'
    '<method name="Notify"><arg type="s"/><arg type="u"/><arg type="s"/><arg type="s"/>'
    '<arg type="s"/><arg type="as"/><arg type="a{sv}"/><arg type="i"/>'
    '<arg type="u" direction="out"/></method></interface></node>')
bus.register_object("/org/freedesktop/Notifications", node.interfaces[0], called)
Gio.bus_own_name_on_connection(bus, "org.freedesktop.Notifications", 0, None, None)
GLib.MainLoop().run()
"""


def test(agent, tool, bridge):
    require("Xvfb", "xdotool", "dbus-daemon", "gdbus", "zenity")
    if subprocess.run(["/usr/bin/python3", "-c", "import gi"]).returncode:
        skip("python3-gi is not installed (scripts/install-deps installs it)")
    with Run("bridge") as run:
        # Private fontconfig (DejaVu and the user font folder only) and private XDG_DATA_DIRS,
        # which fontconfig also searches; a desktop entry naming the application.
        fonts = run.path("home/fonts")
        os.makedirs(fonts)
        os.makedirs(run.path("data/applications"))
        with open(run.path("fonts.conf"), "w") as f:
            f.write(f'<?xml version="1.0"?>\n<fontconfig><dir>/usr/share/fonts/truetype/dejavu'
                    f'</dir><dir>{fonts}</dir><cachedir>{run.path("cache")}</cachedir>'
                    '</fontconfig>\n')
        with open(run.path(f"data/applications/{APP_ID}"), "w") as f:
            f.write("[Desktop Entry]\nType=Application\nName=Example Reader\n"
                    "Name[de]=Beispielleser\nExec=true\n")
        run.env.update(XDG_DATA_DIRS=run.path("data"), XDG_STATE_HOME=run.path("state"),
                       GLYPHWELL_INPUT_GUARD_MS="0", QT_QPA_PLATFORM="xcb", LANGUAGE="de")
        run.env.pop("WAYLAND_DISPLAY", None)
        fc_list = lambda: subprocess.run(["fc-list", ":lang=ja", "file"], env=run.env,  # noqa
                                         capture_output=True, text=True).stdout
        check(fc_list() == "", f"the private fontconfig has a Japanese font: {fc_list()}")
        run.server = FontServer(JAPANESE_FONT)
        run.server.released.set()
        subprocess.run([tool, "catalog", "add", JAPANESE_FONT, "--url-prefix",
                        run.server.url.rsplit("/", 1)[0], "--catalog",
                        run.path("data/glyphwell/downloadable-fonts.json")],
                       env=run.env, check=True, capture_output=True)

        run.start_session_bus()

        def gdbus(method, *arguments):
            """Calls `method` of the bridge, or of the bus itself when it is the bus's."""
            bus = method.startswith("org.freedesktop.DBus.") and "." not in method[21:]
            dest, path = ("org.freedesktop.DBus", "/org/freedesktop/DBus") if bus else (NAME, PATH)
            result = subprocess.run(["gdbus", "call", "--session", "--dest", dest,
                                     "--object-path", path, "--method", method, *arguments],
                                    env=dict(run.env, LANGUAGE="en"), capture_output=True,
                                    text=True, timeout=10)
            return (result.stdout + result.stderr).strip()

        owned = lambda: gdbus("org.freedesktop.DBus.NameHasOwner", NAME)  # noqa: E731

        def bridge_exits_leaving_the_name(log, line):
            status = run.start(log, [bridge]).wait(10)
            check(status == 0 and run.read(log + ".log").strip() == line,
                  f"the bridge ended with {status}: {run.read(log + '.log')!r}")

        # Another provider's service file, then another owner: the bridge leaves the name.
        with open(run.path(f"services/{NAME}.service"), "w") as f:
            f.write(f"[D-BUS Service]\nName={NAME}\nExec=/bin/false\n")
        bridge_exits_leaving_the_name(
            "bridge-activatable", f"{NAME} is provided by a D-Bus service file; leaving it to "
                                  "that provider")
        check(owned() == "(false,)", f"the name was taken: {owned()}")
        os.remove(run.path(f"services/{NAME}.service"))
        gdbus("org.freedesktop.DBus.ReloadConfig")
        bridge_process = run.start("bridge", [bridge])
        wait_for("the bridge to own the name", lambda: owned() == "(true,)")
        bridge_exits_leaving_the_name(
            "bridge-second", f"{NAME} is owned by another connection; leaving it to that provider")

        def bridge_logs(line, count=1):
            wait_for(f"the bridge to log {line!r}", lambda: run.read("bridge.log").count(line)
                     >= count, timeout=20)

        def client(mode, app, *resources):
            process = run.start(f"client-{len(run.processes)}", ["/usr/bin/python3", "-c",
                                                                  CLIENT, mode, app, *resources])
            wait_for("the client's calls", lambda: "sent" in run.read(
                f"client-{len(run.processes) - 1}.log") or process.poll() is not None)
            check(process.poll() is None, "the GDBus client ended")
            return process

        # Every font request gets the success reply, whatever it holds; other methods do not.
        replies = [
            (("org.freedesktop.DBus.Properties.GetAll", MODIFY2), "(@a{sv} {},)"),
            ((MODIFY2 + ".InstallFontconfigResources", "@as []", "", "", "{}"), "()"),
            ((MODIFY2 + ".InstallFontconfigResources", "[':weight=3\\n\\u0001', ':lang=\\u00e9']",
              "", "", "{}"), "()"),
            ((NAME + ".Modify.InstallFontconfigResources", "0", "[':lang=ja']", "show"), "()"),
            ((MODIFY2 + ".InstallMimeTypes", "['text/x-x']", "", "", "{}"),
             "Error: GDBus.Error:org.freedesktop.DBus.Error.NotSupported: Glyphwell installs "
             "fonts only; InstallMimeTypes is not supported"),
        ]
        for arguments, expected in replies:
            reply = gdbus(*arguments)
            check(reply == expected, f"{arguments[0]} replied {reply[:200]!r}, not {expected!r}")
        client("sync", "", "[f':lang=x{i}' for i in range(10000)]", "['a' * (1 << 20)]")
        introspection = gdbus("org.freedesktop.DBus.Introspectable.Introspect")
        check(all(f'<interface name="{i}">' in introspection for i in (MODIFY2, NAME + ".Modify")),
              f"the interfaces are not introspectable: {introspection[:2000]}")
        log = run.read("bridge.log")
        for line in ["Cannot serve the font resource :weight=3\\n\\x01 from ",
                     "Cannot serve 248 more font resources from ",
                     "Left out 9744 font resources beyond the first 256 from ",
                     "Cannot serve the font resource " + "a" * 128 + "... from "]:
            check(line in log, f"the bridge did not log {line[:60]!r}: {log[-2000:]}")

        # Without the agent, one line per burst; more callers at once than the queue holds.
        client("async", "", "[':lang=ja']")
        bridge_logs("Cannot ask the agent about the fonts for python3")
        client("many:70", "", "[':lang=ko']")
        bridge_logs("Cannot ask the agent about the fonts for python3", 65)
        client("async", "", "[':lang=th']")  # room again: the drops are counted
        bridge_logs("Dropped 5 more font requests while 64 were waiting")
        check(run.read("bridge.log").count(": 64 requests are waiting already") == 1,
              "more than one line for the dropped callers")

        # The questions, answered with keys on a private X server.
        run.env["DISPLAY"] = start_xvfb(run)
        run.start("notifications", ["/usr/bin/python3", "-c", NOTIFICATIONS])
        agent_process = run.start_agent(agent)

        windows = lambda: subprocess.run(  # noqa: E731
            ["xdotool", "search", "--onlyvisible", "--pid", str(agent_process.pid)], env=run.env,
            capture_output=True, text=True, timeout=5).stdout.split()

        def answer(keys):
            window = wait_for("the question", lambda: next(iter(windows()), None))
            subprocess.run(["xdotool", "windowfocus", "--sync", window, "key",
                            "--clearmodifiers", *keys], env=run.env, timeout=5)
            wait_for("the question to go", lambda: window not in windows(), timeout=15)

        asking = "Asking to download WenQuanYi Micro Hei for "
        # LibreOffice's sequence, two languages from one caller: one question, named after the
        # desktop entry in the user's language; Return is Skip, and Skip is remembered.
        office = client("sync", APP_ID, "[':lang=ja', ':lang=ko']")
        bridge_logs(asking + f"Beispielleser (process {office.pid})")
        answer(["Return"])
        client("sync", APP_ID, "[':lang=ja']")
        bridge_logs("Not asking about fonts for Beispielleser: what it asked for is installed "
                    "or was declined")
        # An installed language asks nothing.
        client("async", "", "[':lang=en']")
        bridge_logs("Not asking about fonts for python3", 1)
        # The GTK module's calls: two from one caller within a second make one question, which
        # goes when the caller quits.
        gtk = client("async", "", "[':lang=ja']", "[':lang=zh-cn']")
        bridge_logs(asking + "python3")
        wait_for("the question", windows)
        gtk.kill()
        wait_for("the question to be withdrawn", lambda: not windows(), timeout=15)
        check(run.read("bridge.log").count(asking) == 2, "a burst made two questions")
        # A real GTK application with the font-install module: Download installs the font, which
        # the application's fontconfig then finds.
        zenity = run.start("zenity", ["zenity", "--info", "--text", "日本語のテキスト"],
                           env=dict(run.env, GTK_MODULES="pk-gtk-module", NO_AT_BRIDGE="1",
                                    # GTK's MIME data; fonts.conf names no XDG font folder
                                    XDG_DATA_DIRS=run.path("data") + ":/usr/share",
                                    # Pango tags CJK text "ja" only under a known language
                                    LC_ALL="de_DE.UTF-8"))
        answer(["shift+Tab", "space"])
        bridge_logs("Installed WenQuanYi Micro Hei for zenity")
        wait_for("the notification", lambda: run.read("notifications.log") == (
            "Fonts installed | WenQuanYi Micro Hei can now be used. zenity may need a restart to "
            "show them.\n"))
        check(zenity.poll() is None, "zenity ended")
        check(fc_list().startswith(fonts + "/"), f"fc-list :lang=ja finds {fc_list()!r}")

        bridge_process.terminate()
        check(bridge_process.wait(10) == 0, "the bridge did not end cleanly on SIGTERM")
        check(owned() == "(false,)", "the name outlived the bridge")

        # A font chooser that crashes, fails or answers nonsense: one line, the burst dropped.
        os.makedirs(run.path("broken"))
        shutil.copy(bridge, run.path("broken"))
        worker = run.path("broken/glyphwell-bus-bridge-worker")
        broken = run.start("broken", [run.path("broken/glyphwell-bus-bridge")])
        wait_for("the bridge to own the name", lambda: owned() == "(true,)")
        for script, line in [("kill -SEGV $$", "its font chooser was ended by signal 11"),
                             ("exit 3", "its font chooser ended with status 3"),
                             ("printf 'name=x'", "its font chooser gave no answer")]:
            with open(worker, "w") as f:
                f.write(f"#!/bin/sh\n{script}\n")
            os.chmod(worker, 0o755)
            client("async", "", "[':lang=ja']")
            wait_for(f"the bridge to log {line!r}", lambda: line in run.read("broken.log"))
        check(run.read("broken.log").count("Dropping the font request") == 3,
              f"not one line per broken chooser: {run.read('broken.log')}")


if __name__ == "__main__":
    main(test, __doc__, 3)
