"""The Client3 client as Python users meet it: methods named and ordered as the application's commands,
keywords, text as str, paths, notes on refused arguments, clients that raise, records that are true
when they succeeded, the version and the guide."""
import inspect
import os
import pathlib
import subprocess
import sys

import pytest

import _Client3
import Client3
import hostproc
from Client3 import _catalogue

CLIENT = Client3.Client
METHODS = Client3.TABLE["ZarvoPelluxPostClient"].methods
# The library's operations that are not commands of the application, with their parameters.
LIBRARY = {"Connect": ["address", "port"], "Disconnect": [], "IsConnected": [], "AllocSafeString": ["text"]}
COMMANDS = {name: inputs for name, _, inputs, _ in _catalogue.COMMANDS}
NOTES = sys.version_info >= (3, 11)


@pytest.fixture(autouse=True)
def client3_classes(companion_classes):
    """Client3's classes for every test of this file."""


@pytest.fixture(scope="module")
def own_host(tmp_path_factory):
    """An application of this file's own: the table of calls runs setters on it, the path tests save."""
    started = hostproc.start(log_path=tmp_path_factory.mktemp("host") / "host.log")
    yield started
    started.stop()


@pytest.fixture
def client(host):
    with Client3.connect(host.address, host.port) as connected:
        yield connected


def parameters(method):
    return list(inspect.signature(getattr(CLIENT, method)).parameters)[1:]


def catalogue_inputs(client, command):
    """The command's inputs as the running application describes them (GetCommandInfo)."""
    text = client.GetCommandInfo(command).check().DefaultOutputString()
    block = text.split("Input Parameters\n", 1)[1].split("\n", 1)[1].split("-----", 1)[0]
    names = [line.split()[0] for line in block.splitlines() if line.strip()]
    return [] if names == ["None"] else names


@pytest.mark.parametrize("name, spelled", [
    ("Subject", "subject"), ("SelectedOnly", "selected_only"), ("IDList", "id_list"), ("Vector3D", "vector3_d"),
    ("Import", "import_"),
])
def test_catalogue_names_are_spelt_in_snake_case(name, spelled):
    assert Client3.snake_case(name) == spelled


@pytest.mark.parametrize("method", METHODS)
def test_signature_is_the_commands_inputs_in_order(client, method):
    if method in LIBRARY:
        expected = LIBRARY[method]
    elif method.startswith("OfflineSet") and method.endswith("Settings"):
        expected = ["settings"]
    else:
        expected = [Client3.snake_case(name) for name in catalogue_inputs(client, method)]
    assert parameters(method) == expected
    assert parameters(method) == list(inspect.signature(getattr(Client3.RaisingClient, method)).parameters)[1:]


def sample(client, method, parameter, kind):
    """An argument of the command's wire type that the application refuses or can take twice alike; a
    text names its parameter, so that arguments given in the wrong places show in the answer."""
    if method.startswith("OfflineSet"):
        return getattr(client, method.replace("OfflineSet", "OfflineGet"))().check()
    if method == "ProcessRequest" and parameter == "parameters":
        return client.GetCommandInfo("GetMarkerNames").check().InputParameters
    return {"String": f"/nowhere/{parameter}", "Int": 3, "UInt": 3, "ULong": 2**40, "Bool": True, "Float": 0.5,
            "Double": 0.5, "Doubles": [0.5], "Bools": [True]}[kind]


def answer(value):
    """What a call answered, comparable between calls: a record's fields, a parameter list by type."""
    if isinstance(value, Client3.Output_Result):
        fields = [getattr(value, field) for field in value._fields]
        return type(value).__name__, [type(f).__name__ if isinstance(f, Client3.ParameterVector) else f for f in fields]
    return str(value) if isinstance(value, Client3.SafeString) else value


CALLED = [method for method in METHODS if parameters(method) and method != "Connect"]


@pytest.mark.parametrize("method", CALLED)
def test_keywords_and_positions_make_the_same_call(own_host, method):
    with Client3.connect(own_host.address, own_host.port) as client:
        kinds = [kind for _, kind in COMMANDS.get(method, [("", "String")] * len(parameters(method)))]
        values = [sample(client, method, name, kind) for name, kind in zip(parameters(method), kinds)]
        flat = getattr(_Client3, "ZarvoPelluxPostClient_" + method)(client, *values)
        by_keyword = getattr(client, method)(**dict(zip(parameters(method), values)))
        by_position = getattr(client, method)(*values)
        assert answer(by_keyword) == answer(flat) == answer(by_position)


# ---- Text ----------------------------------------------------------------------------------------

def test_text_fields_read_as_str_and_lists_of_text_as_lists_of_str(client):
    assert client.GetSubjectNames().check().Names == ["Alice", "Bob"]
    assert type(client.GetSceneName().check().Name) is str


@pytest.mark.parametrize("value, read", [("walk", "walk"), (b"run", "run"), (b"caf\xe9", "caf\udce9"), ("d\u00e9j\u00e0", "d\u00e9j\u00e0")])
def test_text_assigned_to_a_field_reads_back_as_str(value, read):
    parameter = Client3.Type_Parameter()
    parameter.Value = value
    assert parameter.Value == read and type(parameter.Value) is str


def test_vectorss_elements_read_as_str():
    texts = Client3.vectorss(["LANK", "RANK", "C7"])
    read = [texts[0], texts[-1], texts.front(), texts.back(), *texts]
    assert read == ["LANK", "C7", "LANK", "C7", "LANK", "RANK", "C7"]
    assert {type(text) for text in read} == {str}
    assert type(texts[1:]) is Client3.vectorss
    assert list(reversed(texts)) == ["C7", "RANK", "LANK"]
    assert texts.pop(0) == "LANK" and texts.pop() == "C7" and texts == ["RANK"]


# ---- Paths ---------------------------------------------------------------------------------------

@pytest.mark.parametrize("convert", [str, os.fsencode, pathlib.Path], ids=["str", "bytes", "Path"])
def test_file_commands_take_paths(tmp_path, convert, own_host):
    with Client3.connect(own_host.address, own_host.port) as client:
        path = tmp_path / "take.scene"
        assert client.SaveFile(convert(path), "")
        assert client.LoadFile(path=convert(path))
        assert client.DatabaseCreate(convert(tmp_path), "db")
        assert client.DatabaseSetCurrent("Database", convert(tmp_path / "db"))
    assert path.exists()


# ---- Notes on refused arguments ------------------------------------------------------------------

@pytest.mark.parametrize("call, error, message, note", [
    (lambda c: c.GetTrajectory(7, "LANK"), TypeError, "Expected string type",
     "ZarvoPelluxPostClient.GetTrajectory(subject, marker): parameter 'subject' was given int 7"),
    (lambda c: c.GetTrajectory("Alice", marker=None), TypeError, "Expected string type",
     "ZarvoPelluxPostClient.GetTrajectory(subject, marker): parameter 'marker' was given NoneType None"),
    (lambda c: c.ObjectGetParameter(1, "x", "p"), TypeError,
     "in method 'ZarvoPelluxPostClient_ObjectGetParameter', argument 3 of type 'int'",
     "ZarvoPelluxPostClient.ObjectGetParameter(object, kind, parameter): parameter 'kind' was given str 'x'"),
    (lambda c: c.TimelineSetFrames(frame=2**40), OverflowError,
     "in method 'ZarvoPelluxPostClient_TimelineSetFrames', argument 2 of type 'int'",
     "ZarvoPelluxPostClient.TimelineSetFrames(frame): parameter 'frame' was given int 1099511627776"),
    (lambda c: c.SetTrajectory("Alice", "LANK", [0.0], ["x"], [0.0], [True]), TypeError,
     "in method 'ZarvoPelluxPostClient_SetTrajectory', argument 5 of type 'std::vector< double,std::allocator< double > > const &'",
     "ZarvoPelluxPostClient.SetTrajectory(subject, marker, x, y, z, e): parameter 'y' was given list ['x']"),
    (lambda c: c.OfflineSetSolvingSettings(c.OfflineGetCircleFitSettings()), TypeError,
     "in method 'ZarvoPelluxPostClient_OfflineSetSolvingSettings', argument 2 of type 'ZarvoSDKClientCPP::Output_SolvingSettings const &'",
     "ZarvoPelluxPostClient.OfflineSetSolvingSettings(settings): parameter 'settings' was given Output_CircleFitSettings "),
    (lambda c: Client3.vectord().append("x"), TypeError, None, "vectord.append(value): parameter 'value' was given str 'x'"),
])
def test_a_refused_argument_keeps_its_error_and_gains_a_note(call, error, message, note):
    unconnected = Client3.Client()
    with pytest.raises(error) as caught:
        call(unconnected)
    assert type(caught.value) is error
    if NOTES:
        assert message is None or str(caught.value) == message
        assert len(caught.value.__notes__) == 1 and caught.value.__notes__[0].startswith(note)
    else:
        assert str(caught.value).startswith(f"{message}\n" if message else "") and note in str(caught.value)
        assert type(caught.value.__cause__) is error


# ---- Failures: records, Client3.Error and clients that raise -------------------------------------

def test_a_record_is_true_when_it_succeeded(client):
    good, bad = client.GetMarkerNames("Alice"), client.GetMarkerNames("Carol")
    assert (bool(good), good.ok) == (True, True)
    assert (bool(bad), bad.ok) == (False, False)
    assert not Client3.Client().GetFrameCount() and not Client3.Client().GetSubjectNames()


@pytest.mark.parametrize("call, code, text, command", [
    (lambda c: c.GetMarkerNames("Carol"), Client3.ApplicationError, "no subject named 'Carol'", "GetMarkerNames"),
    (lambda c: c.OfflineFixOcclusion(subject="Carol", options=""), Client3.ApplicationError, "no subject named 'Carol'",
     "OfflineFixOcclusion"),
    (lambda c: c.SetSceneName(""), Client3.ApplicationError, Client3.ToString(Client3.ApplicationError), "SetSceneName"),
])
def test_a_raising_client_raises_every_failure(host, call, code, text, command):
    with Client3.connect(host.address, host.port, raise_errors=True) as client:
        assert isinstance(client, Client3.RaisingClient)
        assert client.GetMarkerNames("Alice").Names[:2] == ["LFHD", "RFHD"]
        assert client.GetFrameCount() == 1000
        with pytest.raises(Client3.Error) as caught:
            call(client)
    assert (caught.value.code, caught.value.text, caught.value.command) == (code, text, command)
    assert str(caught.value) == f"{command}: {text} (result code {code})"


# ---- The package ---------------------------------------------------------------------------------

def test_version_comes_from_the_package_metadata():
    from importlib.metadata import version

    assert Client3.__version__ == version("client3")
    done = subprocess.run([sys.executable, "-m", "Client3", "--version"], capture_output=True, text=True, timeout=60)
    assert (done.returncode, done.stdout) == (0, f"Client3 {version('client3')}\n")

