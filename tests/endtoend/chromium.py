"""A headless Chromium on a profile of its own, driven by the DevTools protocol on a pipe: it needs no driver and no WebSocket."""
import fcntl
import json
import os
import shutil
import subprocess

from house import TIMEOUT, Failure, check


class Chromium:
    """Debian's Chromium, with an extension or without. Every host name but those of this machine is unknown to it."""

    def __init__(self, house, extension=None):
        check(shutil.which("chromium"), "there is no chromium: run scripts/bootstrap check")
        self.profile = house.directory("chromium")
        self.events = []  # those of the domains that a case enables
        self._house, self._number, self._buffer = house, 0, b""
        extensions = [f"--load-extension={extension}", f"--disable-extensions-except={extension}"] if extension else []
        pipes = [os.pipe(), os.pipe()]  # commands, answers
        theirs = [fcntl.fcntl(pipes[0][0], fcntl.F_DUPFD, 10), fcntl.fcntl(pipes[1][1], fcntl.F_DUPFD, 10)]
        self._process = subprocess.Popen(
            ["chromium", "--headless=new", "--no-sandbox", "--disable-gpu", "--disable-dev-shm-usage",
             "--no-first-run", "--remote-debugging-pipe",
             "--host-resolver-rules=MAP * ~NOTFOUND, EXCLUDE 127.0.0.1", f"--user-data-dir={self.profile}",
             *extensions, "about:blank"],
            env=dict(house.environment, HOME=self.profile), pass_fds=(3, 4), stdout=subprocess.DEVNULL,
            stderr=subprocess.DEVNULL, preexec_fn=lambda: (os.dup2(theirs[0], 3), os.dup2(theirs[1], 4)))
        house.others.append(self._process)
        for descriptor in [*theirs, pipes[0][0], pipes[1][1]]:
            os.close(descriptor)
        self._commands, self._answers = os.fdopen(pipes[0][1], "wb", 0), os.fdopen(pipes[1][0], "rb", 0)

    def call(self, method, session=None, **parameters):
        """Performs a command of the protocol and returns its result."""
        self._number += 1
        command = {"id": self._number, "method": method, "params": parameters, **({"sessionId": session} if session else {})}
        self._commands.write(json.dumps(command).encode() + b"\0")
        while True:
            while b"\0" not in self._buffer:
                data = self._answers.read(65536)
                check(data, f"Chromium ended during {method}")
                self._buffer += data
            line, self._buffer = self._buffer.split(b"\0", 1)
            answer = json.loads(line)
            if answer.get("id") == self._number:
                check("error" not in answer, f"{method}: {answer.get('error')}")
                return answer["result"]
            if "method" in answer:
                self.events.append(answer)

    def targets(self, kind):
        return [each for each in self.call("Target.getTargets")["targetInfos"] if each["type"] == kind]

    def attach(self, target):
        return self.call("Target.attachToTarget", targetId=target["targetId"], flatten=True)["sessionId"]

    def evaluate(self, session, expression):
        """Returns the value of an expression, or of its promise."""
        answer = self.call("Runtime.evaluate", session, expression=expression, awaitPromise=True, returnByValue=True,
                           timeout=TIMEOUT * 1000)
        if "exceptionDetails" in answer:
            raise Failure(f"{expression}: {answer['exceptionDetails']}")
        return answer["result"].get("value")

    def worker(self):
        """The session of the extension's background program, once that runs."""
        def started():
            for target in self.targets("service_worker"):
                session = self.attach(target)
                if self.evaluate(session, "typeof chrome !== 'undefined'"):
                    return session
            return None
        return self._house.soon(started, "the extension's background program didn't start")

    def page(self, address):
        """Opens a tab; its session."""
        return self.attach({"targetId": self.call("Target.createTarget", url=address)["targetId"]})

    def close(self):
        self._process.terminate()
        self._process.wait(TIMEOUT)
