"""The Client3 package: vectors as sequences, text, records and the parameter lists they hold, the
client as a context manager, the host launcher, the testing helpers and the stubs."""
import os
import subprocess
import sys

import pytest

import Client3
from Client3.testing import running_host
from conftest import run_python

ROOT = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))


@pytest.fixture(autouse=True)
def client3_classes(companion_classes):
    """Client3's classes for every test of this file."""


@pytest.fixture(scope="module")
def host():
    with running_host(log=False) as running:
        yield running


SAMPLES = {
    "vectorb": [True, False, True, True, False],
    "vectord": [1.5, -2.25, 3.0, 4.5, 0.0],
    "vectorf": [1.5, -2.25, 3.0, 4.5, 0.0],
    "vectori": [3, -1, 4, 1, -5],
    "vectorull": [2**64 - 1, 0, 7, 2**40, 1],
}


def operations(values):
    """Each step is done on a vector and on a list; both must then hold the same."""
    a, b = values[0], values[1]
    return [
        ("append", lambda s: s.append(a)),
        ("extend", lambda s: s.extend([b, a])),
        ("insert front", lambda s: s.insert(0, b)),
        ("insert past end", lambda s: s.insert(100, b)),
        ("pop last", lambda s: s.pop()),
        ("pop first", lambda s: s.pop(0)),
        ("pop inside", lambda s: s.pop(1)),
        ("reverse", lambda s: s.reverse()),
    ]


@pytest.mark.parametrize("name", sorted(Client3.VECTORS))
def test_vector_follows_a_list(name):
    values = SAMPLES.get(name, ["alpha", "beta", "gamma", "delta", "epsilon"])
    vector, model = Client3.classes[name](values), list(values)
    for step, operation in operations(values):
        result, expected = operation(vector), operation(model)
        assert result == expected and type(result) is type(expected), step
        assert list(vector) == model, step
    assert list(reversed(vector)) == model[::-1]
    assert vector == model
    assert vector == Client3.classes[name](model)
    assert vector != model + model[:1]


@pytest.mark.parametrize("length, text", [
    (3, "vectori([0, 1, 2])"),
    (31, "vectori([" + ", ".join(map(str, range(30))) + ", ... (31 elements)])"),
])
def test_vector_repr_shows_elements_abbreviated(length, text):
    assert repr(Client3.vectori(range(length))) == text


def test_safe_string_text_and_equality():
    text = Client3.SafeString("walk")
    assert str(text) == "walk"
    assert text == "walk"
    assert text != "run"


def test_a_text_field_takes_a_safe_string_and_repr_shows_the_fields():
    parameter = Client3.Type_Parameter()
    parameter.Name = Client3.SafeString("Subject")
    assert repr(parameter) == "Type_Parameter(Name='Subject', Value='')"


def test_a_parameter_list_keeps_its_record_alive(host):
    script = f"""
import gc, Client3
with Client3.connect({host.address!r}, {host.port}) as client:
    inputs = client.GetCommandInfo("GetMarkerNames").check().InputParameters
    gc.collect()
    client.GetCommandList(), client.GetCommandInfo("GetTrajectory")  # reuse the freed memory, if any
    reply = client.ProcessRequest("GetMarkerNames", inputs)
    print(reply.Result, reply.ResultString)
"""
    code, out, err = run_python(script)
    assert (code, out) == (0, "1003 no subject named ''\n"), err


def test_running_host_serves_the_scene_asked_for_and_the_client_disconnects_after_with():
    with running_host(scene="empty", frames=20, log=False) as host:
        with Client3.connect(host.address, host.port) as client:
            assert client.GetFrameCount() == 20
            assert client.GetSubjectNames().check().Names == []
        assert not client.IsConnected()
    assert host.process.poll() is not None


def test_python_m_host_prints_the_same_first_line_and_stops_on_terminate():
    process = subprocess.Popen([sys.executable, "-m", "Client3.host", "--port", "0", "--frames", "10"],
                               stdout=subprocess.PIPE, stderr=subprocess.DEVNULL, text=True)
    try:
        first = process.stdout.readline()
        assert first.startswith("listening on 127.0.0.1:")
        port = int(first.rsplit(":", 1)[1])
        with Client3.connect("127.0.0.1", port) as client:
            assert client.GetFrameCount() == 10
    finally:
        process.terminate()
        assert process.wait(10) == 0
        process.stdout.close()


def test_stubs_agree_with_the_function_table():
    done = subprocess.run([sys.executable, "-m", "Client3._generate", "--check"], cwd=ROOT, capture_output=True, text=True, timeout=60)
    assert done.returncode == 0, done.stderr


def test_stubs_match_the_installed_package(tmp_path):
    """mypy's stubtest compares the stubs with what the installed package builds at import (run away
    from the source tree, so that the installed package is the one imported)."""
    allowed = os.path.join(ROOT, "tests", "stubtest-allowlist.txt")
    done = subprocess.run([sys.executable, "-m", "mypy.stubtest", "--allowlist", allowed, "--ignore-unused-allowlist",
                           "Client3"], cwd=tmp_path, capture_output=True, text=True, timeout=600)
    assert done.returncode == 0, done.stdout + done.stderr
