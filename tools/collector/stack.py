#!/usr/bin/python3
"""Runs a small collector of uploads: nginx, a Redis server as the queue, a PostgreSQL server as the store, and tavrin-collector once
to accept uploads and twice to store them. Each part is started again when it ends, as a service manager does.

    tools/collector/stack.py --origin 127.0.0.1:8080 --certificate cert.pem --key key.pem [--build build/release]

The origin is a search service, for example tavrin-devserver. Debian packages: nginx-light, redis-server, postgresql.
"""
import argparse
import contextlib
import glob
import os
import pathlib
import pwd
import shutil
import signal
import socket
import subprocess
import sys
import tempfile
import threading
import time

HERE = pathlib.Path(__file__).parent


def free_port():
    with socket.create_server(("127.0.0.1", 0)) as free:
        return free.getsockname()[1]


class Stack:
    """The running parts, in a directory of their own. `https` is the address of the front end, and `parts` has their processes."""

    def __init__(self, program, origin, certificate, key):
        self.directory = pathlib.Path(tempfile.mkdtemp(prefix="collector-"))
        self.directory.chmod(0o711)  # PostgreSQL refuses to run as root
        self._as_store = []
        if os.geteuid() == 0:
            self._as_store = ["setpriv", "--reuid=postgres", "--regid=postgres", "--clear-groups"]
        self._ended, self._lock, self.parts, self._threads = threading.Event(), threading.Lock(), {}, []
        try:
            self._start(program, origin, certificate, key)
        except BaseException:
            self.end()
            raise

    def _start(self, program, origin, certificate, key):
        port, accept = free_port(), free_port()
        self.https = f"https://127.0.0.1:{port}"
        (self.directory / "queue").mkdir()
        queue = self.directory / "queue/socket"
        self._make_store()
        text = (HERE / "nginx.conf").read_text()
        for word, value in {"DIRECTORY": self.directory, "USER": pwd.getpwuid(os.geteuid()).pw_name, "HTTPS": port, "ACCEPT": accept,
                            "ORIGIN": origin, "CERTIFICATE": certificate, "KEY": key}.items():
            text = text.replace(f"@{word}@", str(value))
        (self.directory / "nginx.conf").write_text(text)

        self._keep("queue", ["redis-server", "--port", "0", "--unixsocket", queue, "--dir", queue.parent, "--save", "",
                             "--appendonly", "yes", "--appendfsync", "always", "--loglevel", "warning"])
        self._keep("store", [*self._as_store, self._postgres("postgres"), "-D", self.store / "data", "-k", self.store,
                             "-c", "listen_addresses=", "-c", "log_min_messages=fatal"])
        self._keep("accept", [program, "accept", "--queue", queue, "--port", str(accept)])
        for name in ("1", "2"):
            self._keep(f"consumer {name}", [program, "consume", "--queue", queue, "--store", self.database, "--name", name])
        self._keep("nginx", ["/usr/sbin/nginx", "-c", self.directory / "nginx.conf", "-e", self.directory / "nginx.log"])

    @staticmethod
    def _postgres(program):
        return sorted(glob.glob(f"/usr/lib/postgresql/*/bin/{program}"))[-1]

    def _make_store(self):
        self.store = self.directory / "store"
        self.store.mkdir(mode=0o700)
        if self._as_store:
            shutil.chown(self.store, "postgres", "postgres")
        self.database = f"host={self.store} user=collector dbname=postgres"
        subprocess.run([*self._as_store, self._postgres("initdb"), "-D", self.store / "data", "-U", "collector", "-A", "trust",
                        "-E", "UTF8", "--no-locale", "--no-sync"], check=True, stdout=subprocess.DEVNULL, cwd="/")

    def _keep(self, name, command):
        """Starts a part, and starts it again when it ends."""
        def start():
            with self._lock, open(self.directory / "parts.log", "ab") as log:
                if self._ended.is_set():
                    return None
                self.parts[name] = subprocess.Popen(command, stdout=log, stderr=log, cwd="/", process_group=0)
                return self.parts[name]

        def run():
            while part := start():
                part.wait()
                self._ended.wait(0.2)
        thread = threading.Thread(target=run)
        thread.start()
        self._threads.append(thread)

    def kill(self, name):
        """The end of a part and of its processes, without a warning."""
        with contextlib.suppress(ProcessLookupError):
            os.killpg(self.parts[name].pid, signal.SIGKILL)

    def query(self, statement):
        """The rows of the store; each is a list of texts. None if the store is away."""
        done = subprocess.run(["psql", "-XAtq", "-F", "\t", "-c", statement, self.database], capture_output=True, text=True, check=False)
        return [line.split("\t") for line in done.stdout.splitlines()] if done.returncode == 0 else None

    def queued(self):
        """How many uploads wait in the queue. None if it is away."""
        done = subprocess.run(["redis-cli", "-s", self.directory / "queue/socket", "XLEN", "uploads"], capture_output=True, text=True,
                              check=False)
        return int(done.stdout) if done.stdout.strip().isdecimal() else None

    def log(self):
        return (self.directory / "parts.log").read_text(errors="replace")

    def end(self):
        with self._lock:
            self._ended.set()
        for name in self.parts:
            self.kill(name)
        for thread in self._threads:
            thread.join()
        shutil.rmtree(self.directory, ignore_errors=True)


if __name__ == "__main__":
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    for option in ("origin", "certificate", "key"):
        parser.add_argument("--" + option, required=True)
    parser.add_argument("--build", type=pathlib.Path, default=HERE.parents[1] / "build/dev")
    options = parser.parse_args()
    for number in (signal.SIGINT, signal.SIGTERM):
        signal.signal(number, lambda *_: sys.exit())
    stack = Stack(options.build.resolve() / "tools/collector/tavrin-collector", options.origin,
                  os.path.abspath(options.certificate), os.path.abspath(options.key))
    try:
        print(f"{stack.https}/feedback takes uploads; psql '{stack.database}' has them", flush=True)
        while True:  # signal.pause() would wait on if a signal came just before it
            time.sleep(1)
    finally:
        stack.end()
