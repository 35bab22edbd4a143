"""Processes that die at the worst moment: the host killed while a request waits for its reply, and
while a scene is being saved. Nothing hangs, a restarted host is reached again on the same port, and
a scene file is always the old one or the new one, never a mixture."""
import signal
import subprocess
import sys

import _Client3 as m

from hostproc import Client

# Long enough a take that saving it takes a good part of a second.
FRAMES = "40000"


def kill_later(pid, seconds):
    """A process that kills `pid` after `seconds`, while the calling thread is blocked in the module
    waiting for a reply that the host delays for longer."""
    code = f"import os, signal, time; time.sleep({seconds}); os.kill({pid}, signal.SIGKILL)"
    return subprocess.Popen([sys.executable, "-c", code])


def test_host_killed_mid_request_then_restarted(start_host):
    host = start_host("--fault", "delay=5000@GetTrajectory")
    client = Client(host, "timeout=20000")
    killer = kill_later(host.process.pid, 0.5)
    # Seen gone when the connection broke, not when the reply timeout ran out (RequestTimedOut).
    assert client.result("GetTrajectory", "Alice", "LANK")[0] == m.NotConnected
    assert client.IsConnected() is False
    assert killer.wait(10) == 0
    assert host.process.wait(10) == -signal.SIGKILL

    again = start_host("--port", str(host.port))
    assert again.port == host.port
    client.Connect(again.address + "?timeout=20000", again.port)
    assert client.GetFrameCount() == 1000
    client.close()


WATCHER = """
import os, signal, sys, time
pid, folder = int(sys.argv[1]), sys.argv[2]
def state():
    try:
        return sorted((e.name, e.stat().st_size, e.stat().st_mtime_ns) for e in os.scandir(folder))
    except FileNotFoundError:
        return None
first = state()
print("watching", flush=True)
deadline = time.monotonic() + 30
while state() == first and time.monotonic() < deadline:
    pass
os.kill(pid, signal.SIGKILL)
"""


def test_host_killed_as_it_begins_to_write(start_host, tmp_path):
    host = start_host("--frames", FRAMES)
    app = Client(host)
    files = tmp_path / "files"
    files.mkdir()
    path, reference = files / "take.scene", files / "reference.scene"
    app.SaveFile(str(path), "")
    old = path.read_bytes()
    app.SetSceneName("Saved again")
    app.SaveFile(str(reference), "")
    new = reference.read_bytes()
    reference.unlink()
    # Killed at the first change in the folder, whatever the host writes there first.
    killer = subprocess.Popen([sys.executable, "-c", WATCHER, str(host.process.pid), str(files)],
                              stdout=subprocess.PIPE, text=True)
    assert killer.stdout.readline() == "watching\n"
    assert app.result("SaveFile", str(path), "")[0] in (m.Success, m.NotConnected)
    assert killer.wait(40) == 0
    assert path.read_bytes() in (old, new)
    # A fresh host reads the file whole.
    reader = Client(start_host("--scene", str(path)))
    assert reader.GetSceneName()[0] in ("Demo", "Saved again")
    reader.close()
    app.close()
