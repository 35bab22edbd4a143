"""The application, client3-host, for the tests: starting and stopping it, and talking to it, through
the module (a client whose operations answer with their record's fields) or byte by byte on the wire.

A host is started on the loopback address with --port 0; its port is read from the first line it
prints ("listening on 127.0.0.1:PORT") and its log (standard error) goes to a file. This process holds
its standard input (--watch-stdin), so that it ends with the tests however they end."""
import contextlib
import functools
import os
import re
import selectors
import shutil
import signal
import socket
import struct
import subprocess
import sysconfig
import threading
import time

import _Client3 as m

import companion

ADDRESS = "127.0.0.1"
NAME = "client3-host"
MAX_FRAME = 64 << 20  # the most a frame may hold, unless --max-frame says otherwise
NOT_CONNECTED = "Unable to communicate with the host application."


@functools.lru_cache(maxsize=None)
def commands():
    """Every command of the application in the order of their numbers on the wire, with its inputs and
    outputs. (The Client3 package, whose catalogue this is, registers its own classes when it is first
    imported: the tools that start hosts and use the suite's stand-in classes do not import it.)"""
    from Client3 import _catalogue

    return {name: (inputs, outputs) for name, _, inputs, outputs in _catalogue.COMMANDS}


@functools.lru_cache(maxsize=None)
def numbers():
    """Each command's number on the wire, by name."""
    return {name: number for number, name in enumerate(commands())}


# ---- The process --------------------------------------------------------------------------------


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


def first_line(stream, deadline):
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


def wait_until(condition, seconds=5.0):
    """Asks `condition` every 20 ms until it holds, for at most `seconds`; whether it came to hold."""
    deadline = time.monotonic() + seconds
    while not condition():
        if time.monotonic() > deadline:
            return False
        time.sleep(0.02)
    return True


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
        for pipe in (self.process.stdin, self.process.stdout):
            if pipe:
                pipe.close()
        return self.process.returncode


# Hosts asked to stop whose end is collected later: an application that has served a client takes a
# tenth of a second to stop, which a test need not wait for. Hosts are started from several threads
# at once (the random-argument fuzzer's batches): each host is taken off the list by one of them.
_stopping = []
_stopping_lock = threading.Lock()


def stop_later(host):
    """Asks `host` to stop; `collect` waits for it."""
    host.send(signal.SIGTERM)
    with _stopping_lock:
        _stopping.append(host)


def collect(ended_only=False):
    """Waits for the hosts asked to stop (killing those that do not stop in time), or collects only
    those that have ended."""
    with _stopping_lock:
        taken = [host for host in _stopping if not ended_only or not host.running()]
        for host in taken:
            _stopping.remove(host)
    for host in taken:
        host.stop()


def start(*options, log_path, timeout=10, command=None, env=None):
    """Starts the application with `options` (which may name another --host) on a port the system picks;
    returns its Host, or raises RuntimeError with its exit status and log when it does not start.
    `command` runs another build of it (the Windows one under Wine, whose input is not watched), with the
    environment `env`."""
    collect(ended_only=True)
    watched = command is None
    command = command or [executable(), "--watch-stdin"]
    if not command[0]:
        raise RuntimeError(f"{NAME} is not installed: install the project with 'pip install .'")
    with open(log_path, "wb") as log:
        process = subprocess.Popen([*command, "--host", ADDRESS, "--port", "0", *options], env=env,
                                   stdin=subprocess.PIPE if watched else subprocess.DEVNULL, stdout=subprocess.PIPE,
                                   stderr=log)
    line = first_line(process.stdout, time.monotonic() + timeout)
    if not line.startswith("listening on "):
        host = Host(process, None, log_path)
        status = host.stop(signal.SIGKILL)
        raise RuntimeError(f"{NAME} {' '.join(options)} did not start (exit status {status}): {line!r}; its log: {host.log()!r}")
    return Host(process, int(line.rsplit(":", 1)[1]), log_path)


def run_in_session(command, timeout, **options):
    """Runs a program that may start applications of its own in a session of its own, ended whole when
    it ends or when `timeout` passes, so that nothing it started outlives it; answers its
    CompletedProcess (text output)."""
    process = subprocess.Popen(command, stdout=subprocess.PIPE, stderr=subprocess.PIPE, text=True,
                               start_new_session=True, **options)
    try:
        stdout, stderr = process.communicate(timeout=timeout)
    finally:
        if hasattr(os, "killpg"):
            with contextlib.suppress(ProcessLookupError):
                os.killpg(process.pid, signal.SIGKILL)
        else:
            process.kill()
        process.wait()
    return subprocess.CompletedProcess(command, process.returncode, stdout, stderr)


# ---- Through the module -------------------------------------------------------------------------


def address(host, options=""):
    """The host's address as Connect takes it, with its options."""
    return host.address + ("?" + options if options else "")


def parameters(vector):
    """The name and value pairs of a parameter vector, read through the text of a command description
    whose inputs are set to it (the vector has no functions of its own)."""
    sheet = m.ZarvoPelluxPostClient_GetCommandInfo(None, "")
    m.Output_GetCommandInfo_InputParameters_set(sheet, vector)
    text = m.Output_GetCommandInfo_DefaultOutputString(sheet)
    lines = text.split("Input Parameters\n----------------\n", 1)[1].split("-----------------\n", 1)[0].splitlines()
    return [] if lines == ["None"] else [re.fullmatch(r"(\S+) *(.*)", line).groups() for line in lines]


def plain(value, kind=None):
    """A field's value as plain Python: text as str, vectors as lists, parameters as (name, value) pairs."""
    if kind == "Params":
        return parameters(value)
    name = type(value).__name__
    if name == "SafeString":
        return m.SafeString_Value(value)
    if name.startswith("vector"):
        size, item = getattr(m, name + "___len__"), getattr(m, name + "___getitem__")
        return [plain(item(value, i)) for i in range(size(value))]
    return value


class Client:
    """A client of the library through the module's functions, connected to `host` when one is given.
    `client.Op(args)` runs Op and answers its record's outputs as plain values (one alone, several as a
    tuple, in the order the command declares them), or its plain answer; a refusal fails the test
    with its code and message. `client.result("Op", args)` answers the code and message of Op's record, and
    `client.record("Op", args)` the record itself."""

    def __init__(self, host=None, options=""):
        self.proxy = companion.classes["ZarvoPelluxPostClient"]()
        if host is not None:
            self.Connect(address(host, options), host.port)

    def record(self, operation, *args):
        return getattr(m, "ZarvoPelluxPostClient_" + operation)(self.proxy, *args)

    def result(self, operation, *args):
        record = self.record(operation, *args)
        return m.Output_Result_Result_get(record), m.SafeString_Value(m.Output_Result_ResultString_get(record))

    def _run(self, operation, *args):
        record = self.record(operation, *args)
        kind = type(record).__name__
        if not kind.startswith("Output_"):
            return record
        code = m.Output_Result_Result_get(record)
        if code != m.Success:
            raise AssertionError(f"{operation}: {code}: {m.SafeString_Value(m.Output_Result_ResultString_get(record))}")
        outputs = [(name, type_) for name, type_ in commands().get(operation, ((), ()))[1] if hasattr(m, f"{kind}_{name}_get")]
        values = [plain(getattr(m, f"{kind}_{name}_get")(record), type_) for name, type_ in outputs]
        return values[0] if len(values) == 1 else tuple(values) if values else None

    def scene_file(self, path):
        """The scene as its file's bytes, saved to `path`: two such reads tell whether it changed."""
        self.SaveFile(str(path), "")
        return path.read_bytes()

    def __getattr__(self, operation):
        return lambda *args: self._run(operation, *args)

    def close(self):
        m.delete_ZarvoPelluxPostClient(self.proxy)


# ---- On the wire --------------------------------------------------------------------------------


def frame(payload):
    return struct.pack("<I", len(payload)) + payload


def hello(version=1, count=None, token=b""):
    count = len(commands()) if count is None else count
    return frame(b"HZPP1" + struct.pack("<HHI", version, count, len(token)) + token)


def text_value(text):
    data = text.encode()
    return b"\x01" + struct.pack("<I", len(data)) + data


def int_value(number):
    return b"\x02" + struct.pack("<i", number)


def request(number, command, *inputs):
    """A request frame for `command`, by name or by number."""
    command = numbers().get(command, command)
    return frame(b"Q" + struct.pack("<IH", number, command) + b"".join(inputs))


def receive(sock, size):
    data = b""
    while len(data) < size:
        chunk = sock.recv(size - len(data))
        if not chunk:
            return None
        data += chunk
    return data


def read_frame(sock):
    """The next frame's payload, or None when the application closed the connection."""
    header = receive(sock, 4)
    return header and receive(sock, struct.unpack("<I", header)[0])


def reply(payload):
    """A reply's request number, code and message."""
    assert payload[:1] == b"R"
    number, code, size = struct.unpack_from("<IiI", payload, 1)
    return number, code, payload[13:13 + size].decode()


def refusal(payload):
    """The text of the refusal the application sends before it closes a connection."""
    assert payload[:1] == b"E"
    return payload[5:5 + struct.unpack_from("<I", payload, 1)[0]].decode()


def raw_connection(host):
    return socket.create_connection((host.address, host.port), timeout=5)

