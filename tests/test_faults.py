"""Processes that die at the worst moment: the host killed while a request waits for its reply, and a
client or the host killed while a scene is being saved. Nothing hangs, a restarted host is reached
again, and a scene file is always the old one or the new one, never a mixture."""
import os
import signal
import subprocess
import sys

import _Client3 as m

from hostproc import Client, wait_until

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


SAVER = """
import sys, types
sys.path.insert(0, {tests!r})
import companion
companion.register()
from hostproc import Client
client = Client(types.SimpleNamespace(address="127.0.0.1", port={port}))
print("ready", flush=True)
client.SetSceneName({name!r})
client.SaveFile({path!r}, "")
print("saved", flush=True)
"""


def saved_take(start_host, tmp_path):
    """A host, its client, and the take saved in a folder of its own beside the path of a reference
    file: (host, client, folder, take's path, reference's path)."""
    host = start_host("--frames", FRAMES)
    app = Client(host)
    files = tmp_path / "files"
    files.mkdir()
    path, reference = files / "take.scene", files / "reference.scene"
    app.SaveFile(str(path), "")
    return host, app, files, path, reference


def folder_state(folder):
    """Each file of `folder` by name, size and time of change."""
    return sorted((entry.name, entry.stat().st_size, entry.stat().st_mtime_ns) for entry in os.scandir(folder))


def test_client_killed_mid_save(start_host, tmp_path):
    host, app, files, path, reference = saved_take(start_host, tmp_path)
    old, before = path.read_bytes(), folder_state(files)
    script = SAVER.format(tests=os.path.dirname(__file__), port=host.port, name="Saved by a client", path=str(path))
    saver = subprocess.Popen([sys.executable, "-c", script], stdout=subprocess.PIPE, text=True)
    assert saver.stdout.readline() == "ready\n"
    # Killed as soon as the host begins to write the file.
    assert wait_until(lambda: folder_state(files) != before, seconds=30)
    saver.kill()
    saver.communicate(timeout=30)
    # The next command waits for the saver's to end: the host finishes what it began.
    app.SaveFile(str(reference), "")
    assert path.read_bytes() in (old, reference.read_bytes())
    assert sorted(p.name for p in files.iterdir()) == ["reference.scene", "take.scene"]
    app.close()


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
    host, app, files, path, reference = saved_take(start_host, tmp_path)
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
