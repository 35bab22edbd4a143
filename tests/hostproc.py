"""Starting and stopping the application, client3-host, for the tests that talk to it.

A host is started on the loopback address with --port 0; its port is read from the first line it
prints ("listening on 127.0.0.1:PORT") and its log (standard error) goes to a file."""
import os
import selectors
import shutil
import signal
import subprocess
import sysconfig
import time

ADDRESS = "127.0.0.1"
NAME = "client3-host"


def tool_environment():
    """The environment for a native tool that a test runs (a compiler, a build tool, Wine): without the
    sanitizer runtime that a sanitized run preloads into the interpreters."""
    return {k: v for k, v in os.environ.items() if k != "LD_PRELOAD"}


def executable():
    """The installed application: next to this interpreter's scripts first, then on PATH."""
    beside = os.path.join(sysconfig.get_path("scripts"), NAME + (".exe" if os.name == "nt" else ""))
    if os.access(beside, os.X_OK):
        return beside
    return shutil.which(NAME)


def _first_line(stream, deadline):
    """Reads the first line of `stream` (a pipe) without waiting past `deadline`."""
    line = b""
    with selectors.DefaultSelector() as selector:
        selector.register(stream, selectors.EVENT_READ)
        while not line.endswith(b"\n"):
            left = deadline - time.monotonic()
            if left <= 0 or not selector.select(left):
                break
            chunk = os.read(stream.fileno(), 256)
            if not chunk:
                break
            line += chunk
    return line.decode(errors="replace").strip()


class Host:
    """One running application: its process, its port and its log file."""

    address = ADDRESS

    def __init__(self, process, port, log_path):
        self.process = process
        self.port = port
        self.log_path = log_path

    def log(self):
        """Everything the application has logged so far."""
        with open(self.log_path, encoding="utf-8", errors="replace") as log:
            return log.read()

    def running(self):
        return self.process.poll() is None

    def send(self, number):
        """Sends signal `number` while the application runs."""
        if self.running():
            self.process.send_signal(number)

    def stop(self, number=signal.SIGTERM, timeout=10):
        """Asks the application to stop and waits for it (killing it when it does not stop in time);
        returns its exit status."""
        self.send(number)
        try:
            self.process.wait(timeout)
        except subprocess.TimeoutExpired:
            self.process.kill()
            self.process.wait(timeout)
        self.process.stdout.close()
        return self.process.returncode

    def kill(self):
        return self.stop(signal.SIGKILL)


def start(*options, log_path, timeout=10):
    """Starts the application with `options` on a port the system picks; returns its Host."""
    program = executable()
    if not program:
        raise RuntimeError(f"{NAME} is not installed: install the project with 'pip install .'")
    with open(log_path, "wb") as log:
        process = subprocess.Popen([program, "--host", ADDRESS, "--port", "0", *options],
                                   stdin=subprocess.DEVNULL, stdout=subprocess.PIPE, stderr=log)
    line = _first_line(process.stdout, time.monotonic() + timeout)
    prefix = f"listening on {ADDRESS}:"
    if not line.startswith(prefix):
        host = Host(process, None, log_path)
        host.kill()
        raise RuntimeError(f"{NAME} {' '.join(options)} did not start: {line!r}; its log: {host.log()!r}")
    return Host(process, int(line[len(prefix):]), log_path)
