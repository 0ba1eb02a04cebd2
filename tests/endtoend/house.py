"""What every end-to-end case runs against: a search service, a daemon and its clients, on private directories.

BUILD is the build directory that the programs come from; build/dev if it is not set.
"""
import json
import os
import pathlib
import re
import signal
import ssl
import struct
import subprocess
import sys
import tempfile
import threading
import time
import traceback
import urllib.request

BUILD = pathlib.Path(os.environ.get("BUILD", pathlib.Path(__file__).parents[2] / "build/dev"))
TAVRIND = BUILD / "tavrind/tavrind"
TAVRINCTL = BUILD / "tools/tavrinctl/tavrinctl"
DEVSERVER = BUILD / "tools/devserver/tavrin-devserver"
REPLAY = BUILD / "tools/replay/tavrin-replay"
FILTERED = pathlib.Path(__file__).parent / "filtered"
CLIENTS = pathlib.Path(__file__).resolve().parents[2] / "clients"
os.environ["no_proxy"] = "*"  # whatever proxy the environment has
BUS = """<busconfig><type>session</type><listen>unix:dir={0}</listen><servicedir>{0}</servicedir><policy context="default">
<allow user="*"/><allow own="*"/><allow send_destination="*" eavesdrop="true"/><allow eavesdrop="true"/></policy></busconfig>"""
TIMEOUT = 60  # seconds for anything to happen, on a busy machine


class Failure(Exception):
    """A program did not do what it should."""


def check(holds, what):
    if not holds:
        raise Failure(what)


def whole_records(path):
    """The complete records of a session file."""
    data, at, records = path.read_bytes(), 0, []
    while at + 8 < len(data):
        (length,) = struct.unpack_from("=Q", data, at)
        if length == 0 or at + 8 + length > len(data):
            break
        records.append(data[at + 8:at + 8 + length])
        at += 8 + length
    return records


def start_bus(directory, **options):
    """Starts a message bus, which starts the programs of the directory. Returns its process and its address."""
    configuration = pathlib.Path(directory, "bus.conf")
    configuration.write_text(BUS.format(directory))
    bus = subprocess.Popen(["dbus-daemon", "--nofork", f"--config-file={configuration}", "--print-address=1"],
                           stdout=subprocess.PIPE, **options)
    address = bus.stdout.readline().decode().strip()
    check(address, "no message bus")
    return bus, address


class Log:
    """The lines that the programs write, as they come. Any thread."""

    def __init__(self):
        self.lines, self._lock = [], threading.Lock()

    def add(self, line):
        with self._lock:
            self.lines.append(line)

    def pump(self, stream):
        """Reads the stream to its end on a thread, which is returned."""
        def read():
            for line in stream:
                self.add(line.decode(errors="replace").rstrip("\n"))
        thread = threading.Thread(target=read, daemon=True)
        thread.start()
        return thread

    def has(self, pattern):
        with self._lock:
            return any(re.search(pattern, line) for line in self.lines)


class House:
    def __init__(self, home):
        self.home = pathlib.Path(home)
        self.environment = dict(os.environ, TERM="xterm")
        for name in ["RUNTIME_DIR", "CONFIG_HOME", "CACHE_HOME", "STATE_HOME", "DATA_HOME", "DATA_DIRS"]:
            self.environment["XDG_" + name] = self.directory(name.lower())
        self.environment["TMPDIR"] = self.directory("tmp")
        self.cache = self.home / "cache_home/com.quorvane.tavrind"
        self.config = self.home / "config_home"
        self.log = Log()
        self.daemon, self.daemon_options = None, ["--check-queues"]
        self.passed_on = "XDG_|SSL_|TMPDIR|.*SAN_OPTIONS"  # the daemon's part of the environment
        self.filtered = False  # True: a system call that the daemon's unit refuses ends it
        self.wrapper, self.program = [], TAVRIND  # the words of a command that runs the daemon, and the daemon
        self.others = []  # processes that a case starts, and that end with the house
        self.service = subprocess.Popen([DEVSERVER, "--http-port", "0", "--https-port", "0", "--cert-dir",
                                         self.home / "certificate", "--quiet"], stdout=subprocess.PIPE,
                                        stderr=subprocess.PIPE)
        self.log.pump(self.service.stderr)

    def open(self):
        """Waits until the service listens, and makes the daemon's settings."""
        line = self.service.stdout.readline()
        check(line, "the service did not start")
        ready = json.loads(line)
        self.http, self.https, self.certificate = ready["http"], ready["https"], ready["ca"]
        self.environment["SSL_CERT_FILE"] = self.certificate
        self.ctl("defaults", "write", "TAVBagURL", self.https + "/bag")

    def directory(self, name):
        (self.home / name).mkdir(mode=0o700, exist_ok=True)
        return str(self.home / name)

    # ---- The daemon

    def socket(self):
        return pathlib.Path(self.environment["XDG_RUNTIME_DIR"], "com.quorvane.tavrind/socket")

    def start_daemon(self, log_level="info"):
        """Holds the socket, as systemd's socket units do; the daemon starts with its first client."""
        self.socket().parent.mkdir(mode=0o700, exist_ok=True)
        passed_on = [f"-E{name}" for name in self.environment if re.match(self.passed_on, name)]
        program = [*self.wrapper, *([FILTERED] if self.filtered else []), self.program]
        self.daemon = subprocess.Popen(["systemd-socket-activate", f"--listen={self.socket()}", *passed_on,
                                        *program, "--log-level", log_level, *self.daemon_options],
                                       env=self.environment, stderr=subprocess.PIPE)
        line = self.daemon.stderr.readline()
        check(b"istening" in line, f"systemd-socket-activate: {line}")
        self.reader = self.log.pump(self.daemon.stderr)

    def begin(self, what="no search was answered", **options):
        """Starts the daemon, which must answer a search."""
        self.start_daemon(**options)
        check(self.answered(), what)

    def restart_daemon(self, with_bag=True):
        """Stops the daemon and starts it again, with the bag on disk or without one."""
        self.stop_daemon()
        if not with_bag:
            (self.cache / "bag.plist").unlink(missing_ok=True)
        self.start_daemon()

    def stop_daemon(self, how=signal.SIGTERM):
        if not self.daemon:
            return
        self.daemon.send_signal(how)
        status = self.daemon.wait(TIMEOUT)
        self.daemon = None
        self.reader.join()
        check(status == 0 or how == signal.SIGKILL, f"the daemon ended with status {status}")

    def pid(self):
        return self.json("status").get("pid")

    # ---- Clients

    def spawn(self, *arguments, **options):
        """A tavrinctl in the background."""
        return subprocess.Popen([TAVRINCTL, "--timeout", "60", *arguments], env=self.environment, **options)

    def ctl(self, *arguments, **options):
        """A tavrinctl to its end: `returncode`, `stdout`, `stderr`."""
        done = subprocess.run([TAVRINCTL, "--timeout", "20", *arguments], env=self.environment,
                              capture_output=True, check=False, **options)
        self.log.add("tavrinctl: " + done.stderr.decode(errors="replace"))
        return done

    def json(self, *arguments, **options):
        """What `tavrinctl --json` prints; empty if it prints nothing."""
        return json.loads(self.ctl("--json", *arguments, **options).stdout or b"{}")

    def outcome(self, query="weather"):
        return self.json("search", query).get("outcome")

    def answered(self):
        """True if one of five searches is answered. Each waits up to a second for the bag; a busy machine may need longer."""
        return any(self.outcome() == "answered" for _ in range(5))

    def report(self, records, *options):
        """Reports events in a connection of its own."""
        return self.ctl(*options, "feedback", "send", "-", input=json.dumps(records).encode())

    def dump(self):
        """Has the daemon upload all that was recorded."""
        check(self.ctl("flush", "dump").returncode == 0, "no flush")

    def uploaded(self, agent):
        """Uploads all that was recorded. Returns the agent's events that the service has."""
        self.dump()
        self.all_sent()
        return [event for upload in self.control("uploads") if upload["agent"] == agent for event in upload["json"]["fb"]]

    def all_sent(self):
        self.soon(lambda: self.books()["uploading"] == 0, "uploads go on and on")

    def books(self):
        """The feedback counters. Every recorded event is in one place, or was dropped for a reason."""
        books = self.json("status")["feedback"]
        places = sum(books[place] for place in ("open", "closed", "uploading", "sent", "notSent", "unknown"))
        check(books["recorded"] == places + sum(books["dropped"].values()), f"the books don't close: {books}")
        return books

    # ---- The service

    def control(self, call, body=None, post=False):
        """The JSON of a control call: a POST if there is a body."""
        data = json.dumps(body).encode() if body is not None else b"" if post else None
        request = urllib.request.Request(f"{self.http}/control/{call}", data, {"Content-Type": "application/json"})
        with urllib.request.urlopen(request, timeout=TIMEOUT) as reply:
            return json.load(reply)

    def fault(self, endpoint, fault, count=0):
        self.control("faults", {"endpoint": endpoint, "fault": fault, "count": count})

    def clear_faults(self):
        self.control("faults/clear", post=True)
        self.control("release", post=True)

    def fetch(self, path):
        """What the service sends, over HTTPS."""
        with urllib.request.urlopen(self.https + path, context=ssl.create_default_context(cafile=self.certificate)) as reply:
            return reply.read()

    def requests(self, endpoint):
        return self.control("status")["by_endpoint"].get(endpoint, 0)

    # ---- Waiting

    def soon(self, holds, what, timeout=TIMEOUT):
        """Waits until `holds()`, which is called ten times a second: there is no event for what other processes do."""
        end = time.monotonic() + timeout
        while not (result := holds()):
            check(time.monotonic() < end, what() if callable(what) else what)
            time.sleep(0.1)
        return result

    def stop_service(self):
        """SIGTERM ends the service at once, with idle and held connections."""
        self.service.terminate()
        status = self.service.wait(TIMEOUT)
        check(status == 0, f"the service ended with status {status}")

    def end(self):
        for process in filter(None, (self.daemon, self.service, *self.others)):
            process.kill()
            process.wait()


def live(parts, *arguments):
    """Runs the parts of a case one after the other, and names each that held."""
    for part in parts:
        part(*arguments)
        print("ok", part.__name__.replace("_", " "), flush=True)


def run(case):
    """Runs the case in a house of its own. The status is 0 if all held and no sanitizer complained."""
    for number in (signal.SIGTERM, signal.SIGHUP):
        signal.signal(number, lambda *_: sys.exit(1))
    with tempfile.TemporaryDirectory(ignore_cleanup_errors=True) as home:
        house = House(home)
        try:
            house.open()
            case(house)
            house.stop_service()
            house.stop_daemon()
            check(not house.log.has("runtime error|AddressSanitizer|ThreadSanitizer"), "a sanitizer complained")
        except Exception as failure:  # whatever it is, the log says more
            sys.stdout.flush()
            told = str(failure) if isinstance(failure, Failure) else traceback.format_exc()
            sys.exit("\n".join(house.log.lines[-40:]) + f"\nFAILED: {told}")
        finally:
            house.end()
