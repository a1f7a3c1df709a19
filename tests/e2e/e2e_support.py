"""Shared pieces of the agent's end-to-end runs: private set-up, waits, font server, X server."""
import hashlib
import http.server
import json
import os
import shutil
import subprocess
import sys
import tempfile
import threading
import time

PORT_NAME = "org.glyphwell.Glyphwell.GlyphwellUIAgent"
# A font on disk offered to message id 1, and the font that message id 2 downloads. The system's
# copy of the latter is hidden from the agent by its private fontconfig configuration.
CANDIDATE_FONT = "/usr/share/fonts/truetype/dejavu/DejaVuSerif.ttf"
DOWNLOAD_FONT = "/usr/share/fonts/truetype/dejavu/DejaVuSerif-Bold.ttf"
DOWNLOAD_NAME = "DejaVuSerif-Bold"
# A font that the catalog offers from a file that the server does not have: its download fails.
MISSING_NAME = "GlyphwellMissing-Regular"
# The two questions: may an application use a font found on disk, may it download a font.
QUESTIONS = [
    ("activation", ["ask-activation", "--candidate", CANDIDATE_FONT, "--app", "Demo"]),
    ("download", ["ask-download", "--font", f"{DOWNLOAD_NAME}:DejaVu Serif", "--app", "Demo"]),
]


class Failure(Exception):
    pass


def check(condition, failure):
    if not condition:
        raise Failure(failure)


def require(*programs):
    for program in (p for p in programs if not shutil.which(p)):
        skip(f"{program} is not installed (scripts/install-deps installs it)")


def skip(reason):
    print(f"SKIP: {reason}")
    sys.exit(77)


def wait_for(what, predicate, timeout=30.0):
    """Polls `predicate` until it returns a true value, which is returned; fails after `timeout`."""
    deadline = time.monotonic() + timeout
    while not (value := predicate()):
        if time.monotonic() > deadline:
            raise Failure(f"timed out after {timeout:.0f} s waiting for {what}")
        time.sleep(0.05)
    return value


class FontServer:
    """Serves one file from 127.0.0.1: the first 16 KiB at once, the rest only once `released` is
    set (or after 60 s), so that the progress window stays up as long as the test needs."""

    def __init__(self, path):
        with open(path, "rb") as f:
            self.body = body = f.read()
        self.name = os.path.basename(path)
        self.started, self.released = threading.Event(), threading.Event()
        server = self

        class Handler(http.server.BaseHTTPRequestHandler):
            def do_GET(self):
                if os.path.basename(self.path) != server.name:
                    self.send_error(404)
                    return
                self.send_response(200)
                self.send_header("Content-Type", "application/octet-stream")
                self.send_header("Content-Length", str(len(body)))
                self.end_headers()
                try:
                    self.wfile.write(body[:16384])
                    self.wfile.flush()
                    server.started.set()
                    server.released.wait(60)
                    self.wfile.write(body[16384:])
                except OSError:
                    pass  # the agent cancelled

            def log_message(self, *args):
                pass

        self.httpd = http.server.ThreadingHTTPServer(("127.0.0.1", 0), Handler)
        self.httpd.daemon_threads = True
        threading.Thread(target=self.httpd.serve_forever, daemon=True).start()
        self.url = f"http://127.0.0.1:{self.httpd.server_address[1]}/{self.name}"

    def close(self):
        self.released.set()
        self.httpd.shutdown()
        self.httpd.server_close()


class Run:
    """Private directories and font setup; its processes are stopped on exit, their logs printed
    when the run fails."""

    def __init__(self, name):
        self.dir = tempfile.mkdtemp(prefix=f"glyphwell-{name}-")  # private to its owner
        for folder in ("runtime", "home", "cache", "config", "data/glyphwell"):
            os.makedirs(self.path(folder), mode=0o700)
        self.runtime, self.processes, self.server = self.path("runtime"), [], None
        self.env = {name: value for name, value in os.environ.items()
                    if name not in ("http_proxy", "HTTP_PROXY", "all_proxy", "ALL_PROXY")}
        self.env.update(XDG_RUNTIME_DIR=self.runtime, XDG_DATA_HOME=self.path("home"),
                        XDG_CACHE_HOME=self.path("cache"), XDG_CONFIG_HOME=self.path("config"),
                        XDG_DATA_DIRS=self.path("data") + ":/usr/local/share:/usr/share",
                        FONTCONFIG_FILE=self.path("fonts.conf"), LANGUAGE="en",
                        LC_ALL="C.UTF-8", no_proxy="127.0.0.1")
        with open(self.path("fonts.conf"), "w") as f:
            f.write('<?xml version="1.0"?>\n<!DOCTYPE fontconfig SYSTEM "fonts.dtd">\n'
                    '<fontconfig><include ignore_missing="yes">/etc/fonts/fonts.conf</include>\n'
                    f"<selectfont><rejectfont><glob>{DOWNLOAD_FONT}</glob></rejectfont>"
                    "</selectfont></fontconfig>\n")

    def path(self, *parts):
        return os.path.join(self.dir, *parts)

    def __enter__(self):
        return self

    def __exit__(self, kind, error, trace):
        for process in reversed(self.processes):
            stop(process)
        if self.server:
            self.server.close()
        for name in sorted(os.listdir(self.dir)) if error is not None else []:
            if name.endswith(".log") and os.path.getsize(self.path(name)):
                lines = self.read(name).splitlines()[-60:]
                print(f"--- {name} (last 60 lines):", *lines, sep="\n", file=sys.stderr)
        shutil.rmtree(self.dir, ignore_errors=True)

    def read(self, name):
        with open(self.path(name), encoding="utf-8", errors="replace") as f:
            return f.read()

    def start(self, name, argv, env=None, **options):
        with open(self.path(name + ".log"), "wb") as log:
            process = subprocess.Popen(argv, env=env or self.env, stdout=log,
                                       stderr=subprocess.STDOUT, **options)
        self.processes.append(process)
        return process

    def start_session_bus(self):
        """Starts a private session bus, its service files in the folder `services`, and points
        the environment at it."""
        os.makedirs(self.path("services"))
        with open(self.path("bus.conf"), "w") as f:
            f.write(f'<busconfig><type>session</type><listen>unix:path={self.path("bus")}</listen>'
                    f'<servicedir>{self.path("services")}</servicedir><auth>EXTERNAL</auth><policy '
                    'context="default"><allow send_destination="*" eavesdrop="true"/><allow '
                    'eavesdrop="true"/><allow own="*"/></policy></busconfig>\n')
        self.start("dbus", ["dbus-daemon", "--nofork", "--config-file", self.path("bus.conf")])
        wait_for("the private bus", lambda: os.path.exists(self.path("bus")))
        self.env["DBUS_SESSION_BUS_ADDRESS"] = "unix:path=" + self.path("bus")

    def serve_download_font(self):
        """Starts the font server and lists its font in the catalog, with a font it lacks."""
        self.server = FontServer(DOWNLOAD_FONT)
        data = self.server.body
        assets = [("DejaVuSerifBold", self.server.url, len(data), hashlib.sha256(data).hexdigest(),
                   DOWNLOAD_NAME, "DejaVu Serif"),
                  ("Missing", self.server.url.replace(self.server.name, "missing.ttf"), 1000,
                   "0" * 64, MISSING_NAME, "Glyphwell Missing")]
        with open(self.path("data/glyphwell/downloadable-fonts.json"), "w") as f:
            json.dump({"assets": [
                {"LocalID": f"org.glyphwell.e2e.{local_id}", "url": url, "size": size,
                 "sha256": sha256, "fonts": [{"postScriptName": name, "family": family}]}
                for local_id, url, size, sha256, name, family in assets]}, f)
        return self.server

    def start_agent(self, agent, **variables):
        """Starts the agent with `variables` changed (None: removed); waits for its socket."""
        env = {name: value for name, value in dict(self.env, **variables).items() if value}
        process = self.start("agent", [agent], env=env)
        wait_for("the agent's socket", lambda: check_running(process, "at start") or
                 os.path.exists(os.path.join(self.runtime, PORT_NAME)))
        return process

    def ask(self, tool, name, *arguments):
        """Sends a request with the glyphwell tool in the background (NAME.reply, NAME.err)."""
        with open(self.path(name + ".reply"), "wb") as out, \
                open(self.path(name + ".err"), "wb") as err:
            process = subprocess.Popen([tool, *arguments, "--compact", "--timeout", "60"],
                                       env=self.env, stdout=out, stderr=err)
        self.processes.append(process)
        return process

    def reply(self, process, name, timeout=30):
        """Waits for the request NAME and returns its reply's Result and Suppress numbers."""
        try:
            status = process.wait(timeout)
        except subprocess.TimeoutExpired:
            raise Failure(f"no reply to the {name} request within {timeout} s") from None
        check(status == 0, f"the {name} request failed ({status}): {self.read(name + '.err')}")
        text = self.read(name + ".reply")
        print(f"{name} reply: {text.strip()}")
        return tuple(json.loads(text).get(key, {}).get("$number")
                     for key in ("QZUIPropertyResult", "QZUIPropertySuppress"))


def check_running(process, when="after its replies"):
    """Fails when the agent ended (it must outlive its replies by 10 s)."""
    check(process.poll() is None, f"the agent ended with status {process.returncode} {when}")


def stop(process, grace=3.0):
    """TERM, a short grace, then KILL."""
    if process.poll() is None:
        process.terminate()
        try:
            process.wait(grace)
        except subprocess.TimeoutExpired:
            process.kill()
            process.wait()


def start_xvfb(run):
    """Starts a private X server and returns its display once Xvfb writes it (then it accepts)."""
    display_read, display_write = os.pipe()
    run.start("xvfb", ["Xvfb", "-displayfd", str(display_write), "-screen", "0", "1024x768x24",
                       "-nolisten", "tcp"], pass_fds=(display_write,))
    os.close(display_write)
    with os.fdopen(display_read) as display:
        number = display.readline().strip()
    if not number:
        raise Failure("Xvfb did not start")
    return f":{number}"


def main(test, usage, arguments=2):
    """Runs `test` with the program's `arguments` (AGENT, GLYPHWELL, ...): PASS, or FAIL with the
    reason (status 1)."""
    if len(sys.argv) != arguments + 1:
        sys.exit(usage.splitlines()[-1])
    try:
        test(*sys.argv[1:])
    except Failure as failure:
        print(f"FAIL: {failure}", file=sys.stderr)
        sys.exit(1)
    print("PASS")
