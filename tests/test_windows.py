"""The application built for 64-bit Windows with mingw-w64, run under Wine and driven by this system's
client: what the platform layer does differently on Windows. Sockets (a reply and a request larger than
a socket buffer, a client that goes away), files (a scene saved
over under a path that is not ASCII, and loaded) and the stop on Ctrl+C, with the log's local time.

The library and the application are built once per session into build/windows of the source tree;
Wine gets a prefix of the session's own. Without the cross-compiler, CMake or Wine the module is
skipped."""
import os
import shutil
import signal
import subprocess
from datetime import datetime, timedelta
from pathlib import Path

import pytest

import _Client3 as m
import hostproc
from hostproc import wait_until

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


@pytest.fixture(scope="module")
def start_windows(windows_exe, wine_env, tmp_path_factory):
    """Starts Windows applications with extra options; each is stopped as Ctrl+C stops it when the
    module's tests end."""
    started = []

    def start(*options):
        log = tmp_path_factory.mktemp("windows") / "host.log"
        started.append(hostproc.start(*options, log_path=log, command=[wine_loader(), windows_exe], env=wine_env, timeout=180))
        return started[-1]

    yield start
    for host in started:
        host.stop(signal.SIGINT, timeout=20)


@pytest.fixture(scope="module")
def windows_host(start_windows):
    """The demo scene served by the Windows application, for the tests that only read."""
    return start_windows()


# ---- Sockets --------------------------------------------------------------------------------------------


def test_a_reply_larger_than_a_socket_buffer_is_the_one_this_system_sends(windows_host, host, clients):
    """A trajectory's reply takes more than one write of the socket: it must arrive whole, as the
    application built for this system sends it."""
    assert clients(windows_host).GetTrajectory("Alice", "RANK") == clients(host).GetTrajectory("Alice", "RANK")


@pytest.fixture(scope="session")
def windows_client(windows_exe):
    """windows_client.cpp built against the client library built for Windows."""
    program = BUILD / "windows_client.exe"
    run([COMPILER, "-std=c++20", "-Wall", "-Wextra", "-Werror", f"-I{ROOT / 'include'}", Path(__file__).with_name("windows_client.cpp"),
         BUILD / "libPelluxPostSDKClientCPP.a", BUILD / "libclient3_platform.a", "-lws2_32", "-static", "-o", program],
        BUILD / "build.log", 300)
    return program


def test_the_windows_library_sends_a_request_larger_than_a_socket_buffer(windows_client, wine_env, host):
    """25 MB go out whole only if the library's connection blocks as it sends; the application
    answers the request it read."""
    done = subprocess.run([wine_loader(), windows_client, host.address, str(host.port)], env=wine_env,
                          capture_output=True, text=True, timeout=180)
    assert done.stdout == "1003 a trajectory needs 1000 frames in X, Y, Z and E (given 1000000, 1000000, 1000000, 1000000)\n"


# ---- Files, the end of a client, and the application's stop ----------------------------------------


def test_scene_file_saved_over_and_loaded(start_windows, clients, tmp_path):
    client = clients(start_windows("--frames", "10"))
    folder = tmp_path / "Szenen ü"
    folder.mkdir()
    path = "Z:" + str(folder / "walk.scene").replace("/", "\\")  # Wine's drive Z: is the root of this system
    client.SaveFile(path, "")
    first = (folder / "walk.scene").read_text(encoding="utf-8")
    assert first.startswith("client3-scene 1\nframes 10\n")

    # Saving again replaces the file in one step.
    assert client.SetSceneName("Überlauf 1") is True
    client.SaveFile(path, "")
    assert [p.name for p in folder.iterdir()] == ["walk.scene"]
    assert (folder / "walk.scene").read_text(encoding="utf-8") != first

    client.NewScene()
    client.LoadFile(path)
    assert client.GetSceneName() == ("Überlauf 1", path)


def test_a_client_gone_frees_its_place(start_windows, clients):
    host = start_windows("--max-clients", "1")
    first = hostproc.Client(host)
    waiting = clients()
    assert waiting.result("Connect", host.address, host.port)[0] == m.ApplicationError  # the one place is taken
    first.close()
    assert wait_until(lambda: waiting.result("Connect", host.address, host.port)[0] == m.Success, seconds=10)
    assert waiting.GetFrameCount() == 1000


def test_stop_with_a_client_connected(start_windows, clients):
    host = start_windows()
    client = clients(host)
    assert host.stop(signal.SIGINT, timeout=20) == 0
    last = host.log().splitlines()[-1]  # "2026-01-31 12:00:00 info stopped"
    assert last.endswith(" info stopped")
    stamp = datetime.strptime(last[:19], "%Y-%m-%d %H:%M:%S")
    assert abs(datetime.now() - stamp) < timedelta(minutes=2)  # the local time
    assert client.result("GetSceneName")[0] == m.NotConnected
