"""The application built for 64-bit Windows with mingw-w64, run under Wine and driven by this system's
client: connecting, the command protocol, the scene, subject and trajectory operations, trajectories
written and read back, scene files, the result codes, a client that vanishes and a clean stop. Every query is
answered as the application built for this system answers it.

The library and the application are built once per session into build/windows of the source tree;
Wine gets a prefix of the session's own. Without the cross-compiler, CMake or Wine the module is
skipped."""
import os
import selectors
import shutil
import signal
import subprocess
import sys
import sysconfig
import time
from datetime import datetime, timedelta
from pathlib import Path

import pytest

import _Client3 as m
import companion
import hostproc

try:
    import fcntl
except ImportError:  # Windows itself: the cross-build is made from another system
    fcntl = None

ROOT = Path(__file__).resolve().parents[1]
BUILD = ROOT / "build" / "windows"
COMPILER = "x86_64-w64-mingw32-g++-posix"


def wine_loader():
    found = shutil.which("wine64") or shutil.which("wine")
    return found or ("/usr/lib/wine/wine64" if os.access("/usr/lib/wine/wine64", os.X_OK) else None)


MISSING = [reason for reason, present in [
    ("a POSIX system to cross-build from", fcntl),
    (f"the mingw-w64 cross-compiler ({COMPILER}, Debian's g++-mingw-w64-x86-64-posix)", shutil.which(COMPILER)),
    ("CMake", shutil.which("cmake")),
    ("Wine (Debian's wine64)", wine_loader()),
] if not present]
pytestmark = pytest.mark.skipif(bool(MISSING), reason="needs " + " and ".join(MISSING))


def run(command, log, timeout):
    """Runs a build step with its output appended to `log`; fails the test with the log's end."""
    with open(log, "a") as out:
        done = subprocess.run(command, stdout=out, stderr=subprocess.STDOUT, timeout=timeout, env=hostproc.tool_environment())
    if done.returncode != 0:
        pytest.fail(f"{' '.join(map(str, command))} failed:\n" + Path(log).read_text()[-4000:])


@pytest.fixture(scope="session")
def windows_exe():
    """client3-host.exe, with the client library beside it, built with the toolchain file."""
    BUILD.mkdir(parents=True, exist_ok=True)
    log = BUILD / "build.log"
    # Sessions that run at the same time in one source tree build one after the other.
    with open(BUILD / "build.lock", "w") as lock:
        fcntl.flock(lock, fcntl.LOCK_EX)
        log.write_text("")
        run(["cmake", "-S", ROOT, "-B", BUILD, "-DCLIENT3_NATIVE_ONLY=ON",
             f"-DCMAKE_TOOLCHAIN_FILE={ROOT / 'cmake' / 'mingw-w64.cmake'}"], log, 300)
        run(["cmake", "--build", BUILD, "--target", "client3-host", "PelluxPostSDKClientCPP", "-j", "2"], log, 900)
    return BUILD / "client3-host.exe"


@pytest.fixture(scope="session")
def wine_env(tmp_path_factory):
    """The environment of Wine processes: a prefix of this session's own, quiet, without a display.
    Wine's server and what it started are stopped when the session ends."""
    env = {k: v for k, v in hostproc.tool_environment().items() if k != "DISPLAY"}
    env.update(WINEPREFIX=str(tmp_path_factory.mktemp("wine")), WINEDEBUG="-all", WINEDLLOVERRIDES="mscoree,mshtml=")
    yield env
    server = shutil.which("wineserver") or str(Path(wine_loader()).with_name("wineserver"))
    subprocess.run([server, "-k"], env=env, timeout=60, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)


class Host:
    """One running application, started with --port 0 on the loopback address; its log is a file."""

    address = "127.0.0.1"

    def __init__(self, command, log_path, env=None, timeout=180):
        self.log_path = log_path
        with open(log_path, "wb") as log:
            self.process = subprocess.Popen([*command, "--port", "0"], stdout=subprocess.PIPE, stderr=log, env=env)
        first = self._first_line(time.monotonic() + timeout)
        if not first.startswith("listening on "):
            self.stop()
            pytest.fail(f"the application did not start: {first!r}\n{self.log()}")
        self.port = int(first.rsplit(":", 1)[1])

    def _first_line(self, deadline):
        line = b""
        with selectors.DefaultSelector() as selector:
            selector.register(self.process.stdout, selectors.EVENT_READ)
            while not line.endswith(b"\n") and selector.select(max(0.0, deadline - time.monotonic())):
                chunk = os.read(self.process.stdout.fileno(), 256)
                if not chunk:
                    break
                line += chunk
        return line.decode(errors="replace").strip()

    def log(self):
        return Path(self.log_path).read_text(errors="replace")

    def stop(self):
        """Asks the application to stop as Ctrl+C does (killing it after 20 s); its exit status."""
        if self.process.poll() is None:
            self.process.send_signal(signal.SIGINT)
        try:
            self.process.wait(20)
        except subprocess.TimeoutExpired:
            self.process.kill()
            self.process.wait(20)
        self.process.stdout.close()
        return self.process.returncode


@pytest.fixture
def start_host(windows_exe, wine_env, tmp_path):
    """Starts Windows applications with extra options; each one is stopped when the test ends."""
    started = []

    def start(*options):
        started.append(Host([wine_loader(), windows_exe, *options], tmp_path / f"host{len(started)}.log", wine_env))
        return started[-1]

    yield start
    for host in started:
        host.stop()


@pytest.fixture(scope="module")
def windows_host(windows_exe, wine_env, tmp_path_factory):
    """The demo scene served by the Windows application, for the tests that only read."""
    host = Host([wine_loader(), windows_exe], tmp_path_factory.mktemp("windows") / "host.log", wine_env)
    yield host
    host.stop()


@pytest.fixture(scope="module")
def native_host(tmp_path_factory):
    """The demo scene served by the application built for this system, to compare with."""
    beside = Path(sysconfig.get_path("scripts")) / "client3-host"
    host = Host([beside if beside.exists() else "client3-host"], tmp_path_factory.mktemp("native") / "host.log")
    yield host
    host.stop()


@pytest.fixture
def clients():
    """Makes clients, connected (with address options) to a host when one is given; deleted after the test."""
    made = []

    def make(host=None, options=""):
        made.append(companion.classes["ZarvoPelluxPostClient"]())
        if host:
            assert result(connect(made[-1], host, options)) == (m.Success, "OK")
        return made[-1]

    yield make
    for client in made:
        m.delete_ZarvoPelluxPostClient(client)


def call(client, operation, *args):
    return getattr(m, "ZarvoPelluxPostClient_" + operation)(client, *args)


def connect(client, host, options=""):
    return call(client, "Connect", host.address + ("?" + options if options else ""), host.port)


def result(record):
    return m.Output_Result_Result_get(record), m.SafeString_Value(m.Output_Result_ResultString_get(record))


def plain(value):
    kind = type(value).__name__
    if kind == "SafeString":
        return m.SafeString_Value(value)
    if kind.startswith("vector"):
        return [plain(getattr(m, kind + "___getitem__")(value, i)) for i in range(getattr(m, kind + "___len__")(value))]
    return value


def reply(record):
    """A record as a dictionary of plain values: its result, its message and every field of its own."""
    kind = type(record).__name__
    names = [n[len(kind) + 1:-4] for n in dir(m) if n.startswith(kind + "_") and n.endswith("_get")]
    fields = {name: plain(getattr(m, f"{kind}_{name}_get")(record)) for name in names if "_" not in name}
    if kind == "Output_GetCommandInfo":  # its parameter lists are read through their text
        fields = {"text": m.Output_GetCommandInfo_DefaultOutputString(record)}
    return dict(fields, code=result(record)[0], message=result(record)[1])


# ---- Queries: the same answers from both builds ------------------------------------------------------

QUERIES = [
    (m.Success, "PSL", ("GetServerInfo",)),
    (m.Success, "GetCommandList", ()),
    (m.Success, "GetCommandInfo", ("SetTrajectoryAtFrame",)),
    (m.Success, "PSL", ("GetSubjectParamDetails Subject=Bob Parameter=Height",)),
    (m.Success, "GetSceneName", ()),
    (m.Success, "GetSubjectNames", ()),
    (m.Success, "GetMarkerNames", ("Bob",)),
    (m.Success, "GetBoneNames", ("Alice", "")),
    (m.Success, "GetBoneDetails", ("Alice", "", "Thorax")),
    (m.Success, "GetConstraintDetails", ("Bob", "", "LANK_LeftFoot")),
    (m.Success, "GetSubjectParamDetails", ("Alice", "", "Height")),
    (m.Success, "GetTrajectory", ("Alice", "RANK")),
    (m.Success, "GetTrajectoryAtFrame", ("Bob", "STRN", 522)),
    (m.ApplicationError, "GetMarkerNames", ("Carol",)),
    (m.ApplicationError, "PSL", ("NoSuchCommand",)),
    (m.InvalidFrameNumber, "GetTrajectoryAtFrame", ("Bob", "STRN", 1001)),
]


@pytest.mark.parametrize("code, operation, args", QUERIES, ids=["-".join([q[1], *map(str, q[2])]) for q in QUERIES])
def test_windows_answers_as_this_system(windows_host, native_host, clients, code, operation, args):
    windows = reply(call(clients(windows_host), operation, *args))
    assert windows["code"] == code, windows["message"]
    assert windows == reply(call(clients(native_host), operation, *args))


def test_connection_life(windows_host, clients):
    client = clients()
    assert result(call(client, "GetSceneName")) == (m.NotConnected, m.ToString(m.NotConnected))
    assert result(connect(client, windows_host)) == (m.Success, "OK")
    assert call(client, "IsConnected") is True
    assert call(client, "GetFrameCount") == 1000
    call(client, "Disconnect")
    assert call(client, "IsConnected") is False
    assert result(call(client, "GetSubjectNames")) == (m.NotConnected, m.ToString(m.NotConnected))


# ---- Writes: a scene of 10 frames of the application's own -------------------------------------------


def test_trajectory_written_is_read_back(start_host, clients):
    client = clients(start_host("--frames", "10"))
    x, y, z = [0.1 * f for f in range(10)], [-1e300] * 10, [2.0 ** -1074] * 10
    seen = [f % 3 != 0 for f in range(10)]
    assert result(call(client, "SetTrajectory", "Bob", "LANK", x, y, z, seen)) == (m.Success, "OK")
    whole = reply(call(client, "GetTrajectory", "Bob", "LANK"))
    assert whole == dict(X=x, Y=y, Z=z, E=seen, code=m.Success, message="OK")

    assert result(call(client, "SetTrajectoryAtFrame", "Bob", "LANK", 10, 1.5, 2.5, -3.5, True)) == (m.Success, "OK")
    at_frame = reply(call(client, "GetTrajectoryAtFrame", "Bob", "LANK", 10))
    assert at_frame == dict(X=1.5, Y=2.5, Z=-3.5, E=True, code=m.Success, message="OK")
    assert result(call(client, "SetTrajectory", "Bob", "LANK", x[:9], y, z, seen)) == (
        m.ApplicationError, "a trajectory needs 10 frames in X, Y, Z and E (given 9, 10, 10, 10)")


def test_scene_renamed(start_host, clients):
    client = clients(start_host())
    assert call(client, "SetSceneName", "Überlauf 1") is True
    assert reply(call(client, "GetSceneName"))["Name"] == "Überlauf 1"
    assert call(client, "SetSceneName", "") is False


def test_scene_file_saved_over_and_loaded(start_host, clients, tmp_path):
    client = clients(start_host("--frames", "10"))
    folder = tmp_path / "Szenen ü"
    folder.mkdir()
    path = "Z:" + str(folder / "walk.scene").replace("/", "\\")  # Wine's drive Z: is the root of this system
    assert result(call(client, "SaveFile", path, "")) == (m.Success, "OK")
    first = (folder / "walk.scene").read_text(encoding="utf-8")
    assert first.startswith("client3-scene 1\nframes 10\n")

    # Saving again replaces the file in one step.
    assert call(client, "SetSceneName", "Second") is True
    assert result(call(client, "SaveFile", path, "")) == (m.Success, "OK")
    assert [p.name for p in folder.iterdir()] == ["walk.scene"]
    assert (folder / "walk.scene").read_text(encoding="utf-8") != first

    assert result(call(client, "NewScene")) == (m.Success, "OK")
    assert result(call(client, "LoadFile", path)) == (m.Success, "OK")
    assert reply(call(client, "GetSceneName")) == dict(Name="Second", Path=path, code=m.Success, message="OK")


# ---- Result codes that the client makes of a misbehaving application ------------------------------


@pytest.fixture(scope="module")
def faulty_host(windows_exe, wine_env, tmp_path_factory):
    faults = ["delay=1000@GetSceneName", "garbage@GetSubjectNames", "text@GetSubjectParamDetails", "frames=2"]
    options = [word for fault in faults for word in ("--fault", fault)]
    host = Host([wine_loader(), windows_exe, *options], tmp_path_factory.mktemp("faulty") / "host.log", wine_env)
    yield host
    host.stop()


@pytest.mark.parametrize("code, operation, args, options", [
    (m.RequestTimedOut, "GetSceneName", (), "timeout=300"),
    (m.ReplyParsingError, "GetSubjectNames", (), ""),
    (m.ConversionError, "GetSubjectParamDetails", ("Alice", "", "Height"), ""),
    (m.ExpectedOneFrame, "GetTrajectoryAtFrame", ("Alice", "LANK", 1), ""),
])
def test_result_code(faulty_host, clients, code, operation, args, options):
    assert result(call(clients(faulty_host, options), operation, *args)) == (code, m.ToString(code))


# ---- A client that vanishes, and the application's stop -----------------------------------------------


def test_vanished_client_frees_its_place(start_host, clients):
    host = start_host("--max-clients", "1")
    script = "\n".join([
        "import _Client3 as m, time",
        "c = m.new_ZarvoPelluxPostClient()",
        f"r = m.ZarvoPelluxPostClient_Connect(c, '{host.address}', {host.port})",
        "print(m.Output_Result_Result_get(r), flush=True)",
        "time.sleep(60)",
    ])
    vanishing = subprocess.Popen([sys.executable, "-c", script], stdout=subprocess.PIPE, text=True)
    try:
        assert vanishing.stdout.readline() == f"{m.Success}\n"
        assert result(connect(clients(), host))[0] == m.ApplicationError  # the one place is taken
    finally:
        vanishing.kill()
        vanishing.wait(20)
        vanishing.stdout.close()
    client = clients()
    deadline = time.monotonic() + 10
    while result(connect(client, host))[0] != m.Success and time.monotonic() < deadline:
        time.sleep(0.1)
    assert call(client, "GetFrameCount") == 1000


def test_stop_with_a_client_connected(start_host, clients):
    host = start_host()
    client = clients(host)
    assert host.stop() == 0
    last = host.log().splitlines()[-1]  # "2026-01-31 12:00:00 info stopped"
    assert last.endswith(" info stopped")
    stamp = datetime.strptime(last[:19], "%Y-%m-%d %H:%M:%S")
    assert abs(datetime.now() - stamp) < timedelta(minutes=2)  # the local time
    assert result(call(client, "GetSceneName"))[0] == m.NotConnected
