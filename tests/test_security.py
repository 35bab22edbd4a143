"""The application's defences against real hosts: the access token, the addresses it listens on only
with one, the directories file commands may use, its limits on frame size and request rate, and a log
in which clients cannot forge lines."""
import os
import socket
import time

import _Client3 as m
import pytest

import companion
import hostproc
from hostproc import Client, address, frame, hello, request, text_value

TOKEN = "correct horse"
NEEDS_TOKEN = "the application needs its access token, and the client did not give it"
WRONG_TOKEN = "the access token the client gave is not the application's"
APPLICATION_ERROR = "Host application encountered an error processing the request."


def connect(host, options=""):
    """The result code and message of a new client's Connect, whether it is then connected, and the
    frame count it reads."""
    client = Client()
    seen = (*client.result("Connect", address(host, options), host.port), client.IsConnected(), client.GetFrameCount())
    client.close()
    return seen


def receive_all(sock):
    """Everything the host sends until it closes the connection."""
    received = b""
    while True:
        chunk = sock.recv(65536)
        if not chunk:
            return received
        received += chunk


# ---- The access token ---------------------------------------------------------------------------------


@pytest.mark.parametrize("host_from_env, options, client_env, accepted", [
    (False, "token=", None, False),
    (False, "token=correct hors", None, False),
    (False, "token=correct horse!", None, False),
    (False, "timeout=2000&token=correct horse&connect=2000", None, True),
    (False, "", TOKEN, True),                         # the client's token from its environment
    (False, "token=wrong", TOKEN, False),             # the address comes before the environment
    (True, "token=correct horse", None, True),        # the host's token from its environment
    (True, "token=wrong", None, False),
])
def test_access_token(start_host, monkeypatch, host_from_env, options, client_env, accepted):
    monkeypatch.delenv("CLIENT3_TOKEN", raising=False)
    if host_from_env:
        monkeypatch.setenv("CLIENT3_TOKEN", TOKEN)
        host = start_host()
        monkeypatch.delenv("CLIENT3_TOKEN")
    else:
        host = start_host("--token", TOKEN)
    if client_env:
        monkeypatch.setenv("CLIENT3_TOKEN", client_env)
    if accepted:
        assert connect(host, options) == (m.Success, "OK", True, 1000)
        return
    given = options.partition("token=")[2] or client_env
    refusal, logged = (WRONG_TOKEN, "it gave a wrong access token") if given else (NEEDS_TOKEN, "it did not give the access token")
    assert connect(host, options) == (m.ApplicationError, f"{APPLICATION_ERROR} 127.0.0.1:{host.port} refused the client: {refusal}", False, 0)
    assert f" warning a client was refused: {logged}\n" in host.log()


def test_host_without_a_token_takes_any(host, monkeypatch):
    monkeypatch.setenv("CLIENT3_TOKEN", "anything")
    assert connect(host, "token=whatever") == (m.Success, "OK", True, 1000)


def test_no_command_runs_before_the_token_is_checked(start_host, clients):
    host = start_host("--token", TOKEN)
    with socket.create_connection((host.address, host.port), timeout=5) as sock:
        # The hello and a request in one write: the request must never run.
        sock.sendall(hello(token=b"wrong") + request(1, "SetSceneName", text_value("Taken over")))
        assert receive_all(sock) == frame(b"E" + text_value(WRONG_TOKEN)[1:])
    assert clients(host, "token=" + TOKEN).GetSceneName()[0] == "Demo"


# ---- Addresses to listen on ---------------------------------------------------------------------------------


@pytest.mark.parametrize("options, problem", [
    *[(("--host", where), f"listening on {where} needs an access token: give --token or CLIENT3_TOKEN")
      for where in ["0.0.0.0", "::", "127.1", "127.a.b.c"]],
    (("--files", "/no/such/directory"), "--files: no directory at '/no/such/directory'"),
])
def test_options_it_refuses_to_start_with(tmp_path, monkeypatch, options, problem):
    monkeypatch.delenv("CLIENT3_TOKEN", raising=False)
    with pytest.raises(RuntimeError, match=r"\(exit status 2\)"):
        hostproc.stop_later(hostproc.start(*options, log_path=tmp_path / "host.log"))  # stopped if it started
    assert (tmp_path / "host.log").read_text().startswith(f"client3-host: {problem}\n")


@pytest.mark.parametrize("where, options, token", [
    ("127.0.0.2", (), None),
    ("localhost", (), None),
    ("0.0.0.0", ("--token", TOKEN), None),
    ("0.0.0.0", (), TOKEN),
])
def test_loopback_or_a_token_lets_it_listen(start_host, monkeypatch, where, options, token):
    monkeypatch.delenv("CLIENT3_TOKEN", raising=False)
    if token:
        monkeypatch.setenv("CLIENT3_TOKEN", token)
    host = start_host("--host", where, *options)
    host.address = "127.0.0.2" if where == "127.0.0.2" else "127.0.0.1"
    assert connect(host, f"token={TOKEN}")[0] == m.Success


# ---- Directories for file commands ----------------------------------------------------------------------


@pytest.fixture
def places(tmp_path):
    """allowed/ (named with --files) holding sub/, a link `exit` to outside/ and a link `secret` to
    outside/secret; outside/ holding a file and a capture database; allowed2/ beside them."""
    allowed, outside = tmp_path / "allowed", tmp_path / "outside"
    (allowed / "sub").mkdir(parents=True)
    (tmp_path / "allowed2").mkdir()
    (outside / "db").mkdir(parents=True)
    (outside / "db" / "client3.database").write_text("client3-database 1\n")
    (outside / "secret").write_text("not a scene")
    os.symlink(outside, allowed / "exit")
    os.symlink(outside / "secret", allowed / "secret")
    return allowed, outside


def outside_contents(outside):
    return sorted(str(p.relative_to(outside)) for p in outside.rglob("*"))


ALLOWED = [
    ("SaveFile", ("{a}/sub/../scene", "")),
    ("SaveFile", ("{a}/sub/scene", "")),
    ("ExportFile", ("{a}/take.csv", "csv")),
    ("AddScriptPath", ("{a}/sub",)),
    ("DatabaseCreate", ("{a}", "db")),
]

REFUSED = [
    ("SaveFile", ("{a}/../outside/scene", "")),
    ("SaveFile", ("{a}/exit/scene", "")),
    ("SaveFile", ("{a}/missing/../../outside/scene", "")),
    ("SaveFile", ("{a}/..", "")),
    ("SaveFile", ("{a}2/scene", "")),  # a sibling whose name begins with the named one
    ("SaveFile", ("scene-in-the-working-directory", "")),
    ("ExportFile", ("{a}/exit/take.csv", "csv")),
    ("LoadFile", ("{o}/secret",)),
    ("LoadFile", ("{a}/secret",)),
    ("ImportFile", ("{a}/exit/secret", "csv", True)),
    ("AddScriptPath", ("{a}/exit",)),
    ("DatabaseCreate", ("{a}/exit", "db2")),
    ("DatabaseSetCurrent", ("Database", "{a}/exit/db")),
]


def filled(args, allowed, outside):
    return [a.format(a=allowed, o=outside) if isinstance(a, str) else a for a in args]


@pytest.mark.skipif(not hasattr(os, "symlink"), reason="no symbolic links")
@pytest.mark.parametrize("operation, args", ALLOWED, ids=[f"{o} {' '.join(map(str, a))}" for o, a in ALLOWED])
def test_file_commands_inside_the_named_directories(start_host, clients, places, operation, args):
    allowed, outside = places
    app = clients(start_host("--files", str(allowed), "--frames", "20"))
    before = outside_contents(outside)
    getattr(app, operation)(*filled(args, allowed, outside))
    assert outside_contents(outside) == before


@pytest.mark.skipif(not hasattr(os, "symlink"), reason="no symbolic links")
@pytest.mark.parametrize("operation, args", REFUSED, ids=[f"{o} {' '.join(map(str, a))}" for o, a in REFUSED])
def test_file_commands_outside_the_named_directories_are_refused(start_host, clients, places, operation, args):
    allowed, outside = places
    app = clients(start_host("--files", str(allowed), "--frames", "20"))
    before = outside_contents(outside), app.GetSceneName()
    args = filled(args, allowed, outside)
    path = args[1] if operation == "DatabaseSetCurrent" else args[0]
    assert app.result(operation, *args) == (m.ApplicationError, f"'{path}' is not inside the directories the application may use")
    assert (outside_contents(outside), app.GetSceneName()) == before
    assert app.DatabaseGetCurrent("Database") == ""


# ---- Limits ---------------------------------------------------------------------------------------------


def test_a_request_over_the_frame_limit_is_refused(start_host, clients):
    host = start_host("--max-frame", "4096")
    app = clients(host)
    app.SetTrajectoryAtFrame("Alice", "LANK", 5, 1.0, 2.0, 3.0, True)
    xyz = companion.classes["vectord"]([1.0] * 1000)
    seen = companion.classes["vectorb"]([True] * 1000)
    assert app.result("SetTrajectory", "Alice", "LANK", xyz, xyz, xyz, seen) == (
        m.ApplicationError, "a frame may hold at most 4096 bytes")
    assert app.IsConnected() is False
    assert clients(host).GetTrajectoryAtFrame("Alice", "LANK", 5) == (1.0, 2.0, 3.0, True)


def test_a_fast_client_is_slowed_and_loses_nothing(start_host, clients):
    app = clients(start_host("--rate", "100"))
    started = time.monotonic()
    for f in range(1, 151):
        app.SetTrajectoryAtFrame("Alice", "LANK", f, float(f), -float(f), 0.5, True)
    # 150 requests at 100 a second after a burst of at most 100: half a second at the least.
    assert time.monotonic() - started >= 0.5
    x, y, z, e = app.GetTrajectory("Alice", "LANK")
    assert (x[:150], y[:150]) == ([float(f) for f in range(1, 151)], [-float(f) for f in range(1, 151)])


# ---- The log ---------------------------------------------------------------------------------------------


@pytest.mark.parametrize("sent, logged", [
    ("back\roverwritten", "back\\roverwritten"),
    ("escape \x1b[2J and delete\x7f", "escape ?[2J and delete?"),
])
def test_client_text_cannot_forge_log_lines(start_host, clients, sent, logged):
    host = start_host()
    clients(host).Log("info", sent)
    assert host.log().splitlines()[-1].split(" info ", 1)[1] == logged
