"""The Client3 package: classes over every registered type, vectors as sequences, records, the
client as a context manager, Client3.Error, the host launcher and the testing helpers."""
import collections.abc
import gc
import os
import subprocess
import sys

import pytest

import _Client3
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


@pytest.fixture
def client(host):
    with Client3.connect(host.address, host.port) as connected:
        yield connected


def test_every_registered_type_has_a_class():
    registered = {name[: -len("_swigregister")] for name in vars(_Client3) if name.endswith("_swigregister")}
    assert set(Client3.classes) == registered


def test_constructed_objects_are_instances_and_are_destroyed_without_a_leak():
    names = [name for name, members in Client3.TABLE.items() if members.constructible and name not in Client3.VECTORS]
    code = (f"import Client3\nfor name in {names!r}:\n"
            "    made = getattr(Client3, name)()\n    print(type(made).__name__, made.this.own())\n    del made\n")
    status, out, err = run_python(code)
    assert (status, err) == (0, "")
    assert out.splitlines() == [f"{name} True" for name in names]


def test_types_without_a_constructor_refuse_construction():
    with pytest.raises(TypeError):
        Client3.Output_GetTrajectory()


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
        ("insert negative", lambda s: s.insert(-2, a)),
        ("insert past end", lambda s: s.insert(100, b)),
        ("set negative", lambda s: s.__setitem__(-1, a)),
        ("set slice", lambda s: s.__setitem__(slice(1, 3), [b, b, b])),
        ("delete index", lambda s: s.__delitem__(-2)),
        ("delete slice", lambda s: s.__delitem__(slice(0, 2))),
        ("delete stepped", lambda s: s.__delitem__(slice(None, None, 2))),
        ("pop last", lambda s: s.pop()),
        ("pop first", lambda s: s.pop(0)),
        ("reverse", lambda s: s.reverse()),
        ("remove", lambda s: s.remove(s[0])),
    ]


@pytest.mark.parametrize("name", sorted(Client3.VECTORS))
def test_vector_follows_a_list(name):
    values = SAMPLES.get(name, ["alpha", "beta", "gamma", "delta", "epsilon"])
    vector, model = Client3.classes[name](values), list(values)
    assert isinstance(vector, collections.abc.MutableSequence)
    for step, operation in operations(values):
        result, expected = operation(vector), operation(model)
        assert result == expected and type(result) is type(expected), step
        assert list(vector) == model, step
        assert len(vector) == len(model), step
    assert list(vector[::-1]) == model[::-1]
    assert list(reversed(vector)) == model[::-1]
    assert [v == m for v, m in zip(vector, model)] == [True] * len(model)
    assert vector[-1] == model[-1] and vector[0] == model[0]
    assert model[0] in vector and vector == model and vector == Client3.classes[name](model)
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
    assert text == "walk" and text != "run"
    assert "walk" in Client3.vectorss(["walk"])


def test_record_fields_are_properties_that_get_and_set():
    record = Client3.Output_ReconstructSettings()
    for field in Client3.TABLE["Output_ReconstructSettings"].fields:
        value = getattr(record, field)
        setattr(record, field, value)
        assert getattr(record, field) == value
    parameter = Client3.Type_Parameter()
    parameter.Name = Client3.SafeString("Subject")
    assert str(parameter.Name) == "Subject"
    assert repr(parameter) == "Type_Parameter(Name='Subject', Value='')"


def test_a_field_keeps_its_record_alive(client):
    x = client.GetTrajectory("Alice", "LANK").X
    gc.collect()
    assert len(x) == 1000 and x[0] == client.GetTrajectory("Alice", "LANK").X[0]


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


def test_python_m_host_refuses_what_the_application_refuses():
    done = subprocess.run([sys.executable, "-m", "Client3.host", "--scene", "nowhere"], capture_output=True, timeout=30)
    assert done.returncode != 0


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
