"""Shared pieces of the agent's end-to-end runs: a private work directory whose processes are
always stopped, waits on conditions with deadlines, a loopback font server that holds its
transfer until the test releases it, a one-font catalog with a private font setup, and the agent
and the glyphwell tool started in that setup."""
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

SKIP = 77
PORT_NAME = "org.glyphwell.Glyphwell.GlyphwellUIAgent"
# A font on disk offered to message id 1, and the font that message id 2 downloads. The system's
# copy of the latter is hidden from the agent by its private fontconfig configuration.
CANDIDATE_FONT = "/usr/share/fonts/truetype/dejavu/DejaVuSerif.ttf"
DOWNLOAD_FONT = "/usr/share/fonts/truetype/dejavu/DejaVuSerif-Bold.ttf"
DOWNLOAD_NAME = "DejaVuSerif-Bold"
# A font that the catalog offers from a file that the server does not have: its download fails.
MISSING_NAME = "GlyphwellMissing-Regular"


class Failure(Exception):
    pass


def skip(reason):
    print(f"SKIP: {reason}")
    sys.exit(SKIP)


def wait_for(what, predicate, timeout=30.0):
    """Polls `predicate` until it returns a true value, which is returned; fails after `timeout`."""
    deadline = time.monotonic() + timeout
    while True:
        value = predicate()
        if value:
            return value
        if time.monotonic() > deadline:
            raise Failure(f"timed out after {timeout:.0f} s waiting for {what}")
        time.sleep(0.05)


class FontServer:
    """Serves one file from 127.0.0.1: the first 16 KiB at once, the rest only once `release()`
    is called (or after 60 s), so that the progress window stays up as long as the test needs."""

    def __init__(self, path):
        with open(path, "rb") as f:
            body = f.read()
        self.name = os.path.basename(path)
        self.started = threading.Event()
        self.released = threading.Event()
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
        self.thread = threading.Thread(target=self.httpd.serve_forever, daemon=True)
        self.thread.start()
        self.url = f"http://127.0.0.1:{self.httpd.server_address[1]}/{self.name}"

    def release(self):
        self.released.set()

    def close(self):
        self.released.set()
        self.httpd.shutdown()
        self.httpd.server_close()


class Run:
    """A private work directory, runtime directory, data and cache homes and font setup; every
    process started through it is stopped on exit, and its logs are printed when the run fails."""

    def __init__(self, name):
        self.dir = tempfile.mkdtemp(prefix=f"glyphwell-{name}-")
        os.chmod(self.dir, 0o700)
        self.runtime = self.path("runtime")
        os.makedirs(self.runtime, mode=0o700)
        for folder in ("home", "cache", "config", "data/glyphwell"):
            os.makedirs(self.path(folder))
        self.processes = []
        self.server = None
        self.env = dict(os.environ)
        for variable in ("http_proxy", "HTTP_PROXY", "all_proxy", "ALL_PROXY"):
            self.env.pop(variable, None)
        self.env.update(
            XDG_RUNTIME_DIR=self.runtime,
            XDG_DATA_HOME=self.path("home"),
            XDG_CACHE_HOME=self.path("cache"),
            XDG_CONFIG_HOME=self.path("config"),
            XDG_DATA_DIRS=self.path("data") + ":/usr/local/share:/usr/share",
            FONTCONFIG_FILE=self.path("fonts.conf"),
            LANGUAGE="en",
            LC_ALL="C.UTF-8",
            no_proxy="127.0.0.1",
        )
        with open(self.path("fonts.conf"), "w") as f:
            f.write(
                '<?xml version="1.0"?>\n<!DOCTYPE fontconfig SYSTEM "fonts.dtd">\n<fontconfig>\n'
                '  <include ignore_missing="yes">/etc/fonts/fonts.conf</include>\n'
                f"  <selectfont><rejectfont><glob>{DOWNLOAD_FONT}</glob></rejectfont>"
                "</selectfont>\n"
                "</fontconfig>\n"
            )

    def path(self, *parts):
        return os.path.join(self.dir, *parts)

    def __enter__(self):
        return self

    def __exit__(self, kind, error, trace):
        for process in reversed(self.processes):
            stop(process)
        if self.server:
            self.server.close()
        if error is not None:
            for name in sorted(os.listdir(self.dir)):
                if name.endswith(".log") and os.path.getsize(self.path(name)):
                    print(f"--- {name} (last 60 lines):", file=sys.stderr)
                    print("\n".join(self.read(name).splitlines()[-60:]), file=sys.stderr)
        shutil.rmtree(self.dir, ignore_errors=True)

    def read(self, name):
        with open(self.path(name), encoding="utf-8", errors="replace") as f:
            return f.read()

    def start(self, name, argv, env=None, **options):
        """Starts `argv` with its standard output and error in NAME.log."""
        with open(self.path(name + ".log"), "wb") as log:
            process = subprocess.Popen(
                argv, env=env or self.env, stdout=log, stderr=subprocess.STDOUT, **options
            )
        self.processes.append(process)
        return process

    def serve_download_font(self):
        """Starts the font server and lists its font in the catalog, with a font it lacks."""
        self.server = FontServer(DOWNLOAD_FONT)
        with open(DOWNLOAD_FONT, "rb") as f:
            data = f.read()
        asset = {
            "LocalID": "org.glyphwell.e2e.DejaVuSerifBold",
            "url": self.server.url,
            "size": len(data),
            "sha256": hashlib.sha256(data).hexdigest(),
            "fonts": [{"postScriptName": DOWNLOAD_NAME, "family": "DejaVu Serif"}],
        }
        missing = {
            "LocalID": "org.glyphwell.e2e.Missing",
            "url": self.server.url.replace(self.server.name, "missing.ttf"),
            "size": 1000,
            "sha256": "0" * 64,
            "fonts": [{"postScriptName": MISSING_NAME, "family": "Glyphwell Missing"}],
        }
        with open(self.path("data/glyphwell/downloadable-fonts.json"), "w") as f:
            json.dump({"assets": [asset, missing]}, f)
        return self.server

    def start_agent(self, agent, env):
        """Starts the agent (its log: agent.log) and waits until it serves its socket."""
        process = self.start("agent", [agent], env=env)
        socket = os.path.join(self.runtime, PORT_NAME)

        def serving():
            if process.poll() is not None:
                raise Failure(f"the agent exited at start with status {process.returncode}")
            return os.path.exists(socket)

        wait_for("the agent's socket", serving)
        return process

    def ask(self, tool, name, *arguments):
        """Sends a request with the glyphwell tool in the background: its reply goes to
        NAME.reply, its errors to NAME.err."""
        with open(self.path(name + ".reply"), "wb") as out, \
                open(self.path(name + ".err"), "wb") as err:
            process = subprocess.Popen(
                [tool, *arguments, "--compact", "--timeout", "60"],
                env=self.env, stdout=out, stderr=err,
            )
        self.processes.append(process)
        return process

    def reply(self, process, name, timeout=30):
        """Waits for the request NAME and returns its reply's Result and Suppress numbers."""
        try:
            status = process.wait(timeout)
        except subprocess.TimeoutExpired:
            raise Failure(f"no reply to the {name} request within {timeout} s")
        if status != 0:
            raise Failure(f"the {name} request failed ({status}): {self.read(name + '.err')}")
        text = self.read(name + ".reply")
        print(f"{name} reply: {text.strip()}")
        value = json.loads(text)
        return tuple(value.get(key, {}).get("$number") for key in
                     ("QZUIPropertyResult", "QZUIPropertySuppress"))


def check_running(process):
    """Fails when the agent ended (it must outlive its replies by 10 s)."""
    if process.poll() is not None:
        raise Failure(f"the agent ended with status {process.returncode} after its replies")


def stop(process, grace=3.0):
    """TERM, a short grace, then KILL."""
    if process.poll() is None:
        process.terminate()
        try:
            process.wait(grace)
        except subprocess.TimeoutExpired:
            process.kill()
            process.wait()


def main(body):
    """Runs `body()`, printing PASS, or FAIL with the reason (exit status 1)."""
    try:
        body()
    except Failure as failure:
        print(f"FAIL: {failure}", file=sys.stderr)
        sys.exit(1)
    print("PASS")
