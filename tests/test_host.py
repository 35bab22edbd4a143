"""The client against the real application: the connection's life, every scene, subject, trajectory
and command-protocol operation on the demo scene, each result code provoked by a real condition, and
an application that keeps serving after clients misbehave.

Tests that change the scene start an application of their own, so that the shared one stays as the
demo scene was made and the order of the tests does not matter."""
import os
import random
import re
import signal
import socket
import struct
import time
import uuid

import pytest

import _Client3 as m
import companion
import repeat

FRAMES = 1000
MARKERS = "LFHD RFHD C7 STRN LASI RASI LWRA RWRA LKNE RKNE LANK RANK".split()
MARKER_BONES = "Head Head Thorax Thorax Pelvis Pelvis LeftHand RightHand LeftShin RightShin LeftFoot RightFoot".split()
BONES = ("Pelvis Thorax Head LeftArm LeftHand RightArm RightHand LeftThigh LeftShin LeftFoot RightThigh RightShin "
         "RightFoot").split()
CONSTRAINTS = [f"{marker}_{bone}" for marker, bone in zip(MARKERS, MARKER_BONES)]
PARAMETERS = ["Height", "Mass", "LeftLegLength", "RightLegLength"]
# The occlusions of the demo scene: (subject, marker) -> (first frame, length in frames).
GAPS = {
    ("Alice", "LWRA"): (121, 12), ("Alice", "RANK"): (401, 35), ("Alice", "C7"): (701, 6), ("Alice", "RWRA"): (851, 80),
    ("Bob", "LANK"): (251, 20), ("Bob", "STRN"): (521, 4), ("Bob", "LKNE"): (611, 45), ("Bob", "LWRA"): (901, 15),
}

NOT_CONNECTED = "Unable to communicate with the host application."
TIMED_OUT = "Host application failed to respond to the information request."
PARSING = "Unable to interpret information sent from the host application."
REFUSED = "Host application encountered an error processing the request."
CONVERSION = "Unable to convert output parameter to a numeric value."
ONE_FRAME = "Invalid number of frames returned, expected one frame."
MAX_FRAME = 64 << 20

# ---- Calling the client --------------------------------------------------------------------------


def new_client():
    return companion.classes["ZarvoPelluxPostClient"]()


def call(client, operation, *args):
    return getattr(m, "ZarvoPelluxPostClient_" + operation)(client, *args)


def connect(client, host, options=""):
    return call(client, "Connect", host.address + ("?" + options if options else ""), host.port)


def result(record):
    return m.Output_Result_Result_get(record), m.SafeString_Value(m.Output_Result_ResultString_get(record))


def ok(record):
    code, text = result(record)
    assert code == m.Success, f"{code}: {text}"
    return record


def elements(vector):
    kind = type(vector).__name__
    get = getattr(m, kind + "___getitem__")
    return [get(vector, i) for i in range(getattr(m, kind + "___len__")(vector))]


def read(record, field):
    """A field of a record as a plain value: text as str, vectors as lists."""
    value = getattr(m, f"{type(record).__name__}_{field}_get")(record)
    kind = type(value).__name__
    if kind == "SafeString":
        return m.SafeString_Value(value)
    if kind == "vectorss":
        return [m.SafeString_Value(text) for text in elements(value)]
    if kind.startswith("vector"):
        return elements(value)
    return value


def trajectory(client, subject, marker):
    record = ok(call(client, "GetTrajectory", subject, marker))
    return {axis: read(record, axis) for axis in "XYZE"}


def at_frame(client, subject, marker, frame):
    record = ok(call(client, "GetTrajectoryAtFrame", subject, marker, frame))
    return tuple(read(record, axis) for axis in "XYZE")


def parameters(client, vector):
    """The name and value pairs of a parameter vector, read through the text of a command description
    whose inputs are set to it (the vector has no functions of its own)."""
    sheet = ok(call(client, "GetCommandInfo", "GetServerInfo"))
    m.Output_GetCommandInfo_InputParameters_set(sheet, vector)
    text = m.Output_GetCommandInfo_DefaultOutputString(sheet)
    inputs = text.split("Input Parameters\n----------------\n", 1)[1].split("-----------------\nOutput Parameters", 1)[0]
    if inputs == "None\n":
        return []
    return [re.fullmatch(r"(\S+) *(.*)", line).groups() for line in inputs.splitlines()]


def wait_until(condition, seconds=3.0):
    """Asks `condition` every 20 ms until it holds, for at most `seconds`; whether it came to hold."""
    deadline = time.monotonic() + seconds
    while not condition():
        if time.monotonic() > deadline:
            return False
        time.sleep(0.02)
    return True


@pytest.fixture
def clients():
    """Makes clients, connected to a host when one is given; every one is deleted after the test."""
    made = []

    def make(host=None, options=""):
        made.append(new_client())
        if host:
            ok(connect(made[-1], host, options))
        return made[-1]

    yield make
    for client in made:
        m.delete_ZarvoPelluxPostClient(client)


@pytest.fixture
def client(host, clients):
    return clients(host)


@pytest.fixture(scope="session")
def commands(host):
    """The application's commands in the order of their numbers on the wire."""
    lister = new_client()
    ok(connect(lister, host))
    listed = read(ok(call(lister, "GetCommandList")), "Commands")
    m.delete_ZarvoPelluxPostClient(lister)
    return listed


def assert_serves(host, clients):
    """The application still runs and answers a well-behaved client correctly."""
    assert host.running()
    client = clients(host)
    assert read(ok(call(client, "GetMarkerNames", "Alice")), "Names") == MARKERS
    assert call(client, "GetFrameCount") == FRAMES
    assert at_frame(client, "Bob", "STRN", 522) == (0.0, 0.0, 0.0, False)


# ---- Connection life -----------------------------------------------------------------------------


def test_connection_life(host, clients):
    client = clients()
    assert call(client, "IsConnected") is False
    assert result(call(client, "GetSceneName")) == (m.NotConnected, NOT_CONNECTED)
    assert call(client, "GetFrameCount") == 0
    assert m.SafeString_Value(call(client, "AllocSafeString", "made by the library")) == "made by the library"

    assert result(connect(client, host)) == (m.Success, "OK")
    assert call(client, "IsConnected") is True
    assert call(client, "GetFrameCount") == FRAMES

    assert call(client, "Disconnect") is None
    assert call(client, "IsConnected") is False
    assert result(call(client, "GetSubjectNames")) == (m.NotConnected, NOT_CONNECTED)
    assert call(client, "GetFrameCount") == 0
    assert call(client, "SetSceneName", "Renamed") is False

    ok(connect(client, host))
    assert read(ok(call(client, "GetSceneName")), "Name") == "Demo"


@pytest.mark.parametrize("address", ["", "127.0.0.1?timeout=0", "localhost?connect=2000&timeout=5000"])
def test_connect_address_forms(start_host, clients, address):
    host = start_host("--fault", "delay=200@GetSubjectNames")  # a reply that keeps the client waiting
    client = clients()
    assert result(call(client, "Connect", address, host.port)) == (m.Success, "OK")
    assert read(ok(call(client, "GetSubjectNames")), "Names") == ["Alice", "Bob"]


def test_second_connect_replaces_the_first(start_host, clients):
    only_one = start_host("--max-clients", "1")
    empty = start_host("--scene", "empty", "--frames", "10")
    client = clients(only_one)
    refused = clients()
    assert result(connect(refused, only_one)) == (
        m.ApplicationError, f"{REFUSED} 127.0.0.1:{only_one.port} refused the client: the application serves at most 1 clients at once")
    assert call(refused, "IsConnected") is False

    ok(connect(client, empty))
    assert read(ok(call(client, "GetSceneName")), "Name") == "Untitled"
    assert call(client, "GetFrameCount") == 10
    # The first connection was closed: its place at the application is free again.
    assert wait_until(lambda: result(connect(refused, only_one))[0] == m.Success)


def test_stopped_application_is_seen_gone(start_host, clients):
    host = start_host()
    client = clients(host)
    assert host.stop() == 0
    assert wait_until(lambda: call(client, "IsConnected") is False)
    assert result(call(client, "GetSceneName")) == (m.NotConnected, NOT_CONNECTED)


def test_killed_application_is_seen_gone(start_host, clients):
    host = start_host()
    client = clients(host)
    assert host.kill() == -signal.SIGKILL
    assert result(call(client, "GetMarkerNames", "Alice")) == (m.NotConnected, NOT_CONNECTED)
    assert call(client, "IsConnected") is False


def _stopped(host):
    with open(f"/proc/{host.process.pid}/stat") as stat:
        return stat.read().rsplit(")", 1)[1].split()[0] == "T"


@pytest.mark.skipif(not os.path.exists("/proc/self/stat"), reason="needs /proc to see that a process is stopped")
def test_hung_application_times_out_and_is_seen_gone_when_killed(start_host, clients):
    host = start_host()
    client = clients(host, "timeout=300")
    host.send(signal.SIGSTOP)
    assert wait_until(lambda: _stopped(host))
    started = time.monotonic()
    assert result(call(client, "GetSceneName")) == (m.RequestTimedOut, TIMED_OUT)
    assert 0.25 < time.monotonic() - started < 2
    # Killed with the request still unread, the application's end resets the connection.
    host.kill()
    assert wait_until(lambda: call(client, "IsConnected") is False)
    assert result(call(client, "GetSceneName")) == (m.NotConnected, NOT_CONNECTED)


def test_records_outlive_their_client(host):
    client = new_client()
    ok(connect(client, host))
    names = call(client, "GetMarkerNames", "Bob")
    path = call(client, "GetTrajectory", "Alice", "RANK")
    m.delete_ZarvoPelluxPostClient(client)
    del client
    assert read(names, "Names") == MARKERS
    assert len(read(path, "X")) == FRAMES
    assert read(path, "E")[400:435] == [False] * 35


# ---- Scene, subjects and trajectories on the demo scene ---------------------------------------------

QUERIES = [
    ("GetSceneName", (), {"Name": "Demo", "Path": ""}),
    ("GetSubjectNames", (), {"Names": ["Alice", "Bob"], "Models": ["Walker", "Walker"], "Active": [True, True]}),
    ("GetMarkerNames", ("Alice",), {"Names": MARKERS}),
    ("GetMarkerNames", ("Bob",), {"Names": MARKERS}),
    ("GetBoneNames", ("Alice", "Walker"), {"Names": BONES}),
    ("GetBoneNames", ("Bob", ""), {"Names": BONES}),
    ("GetRootBone", ("Alice", "Walker"), {"Name": "Pelvis"}),
    ("GetRootBone", ("Bob", ""), {"Name": "Pelvis"}),
    ("GetBoneDetails", ("Alice", "Walker", "Pelvis"), {"Parent": "", "Children": ["Thorax", "LeftThigh", "RightThigh"]}),
    ("GetBoneDetails", ("Alice", "Walker", "Thorax"), {"Parent": "Pelvis", "Children": ["Head", "LeftArm", "RightArm"]}),
    ("GetBoneDetails", ("Bob", "", "LeftFoot"), {"Parent": "LeftShin", "Children": []}),
    ("GetConstraintNames", ("Bob", "Walker"), {"Names": CONSTRAINTS}),
    ("GetConstraintDetails", ("Alice", "Walker", "LANK_LeftFoot"),
     {"Active": True, "Source": "LANK", "Target": "LeftFoot", "Offset": [0, 24, 0], "Type": "Point"}),
    ("GetConstraintDetails", ("Bob", "", "RASI_Pelvis"),
     {"Active": True, "Source": "RASI", "Target": "Pelvis", "Offset": pytest.approx([18.2, -31.2, 0], rel=1e-6),
      "Type": "Point"}),
    ("GetSubjectParamNames", ("Alice", "Walker"), {"Names": PARAMETERS}),
    ("GetSubjectParamDetails", ("Alice", "Walker", "Height"), {"Value": 1680, "DefaultValue": 1750, "Unit": "mm", "Required": True}),
    ("GetSubjectParamDetails", ("Bob", "Walker", "Mass"),
     {"Value": pytest.approx(72.8, rel=1e-6), "DefaultValue": 70, "Unit": "kg", "Required": True}),
    ("GetSubjectParamDetails", ("Bob", "", "RightLegLength"),
     {"Value": pytest.approx(988.0, rel=1e-6), "DefaultValue": 900, "Unit": "mm", "Required": False}),
]


def _ids(table):
    return ["-".join(map(str, (row[0], *row[1]))) for row in table]


@pytest.mark.parametrize("operation, args, expected", QUERIES, ids=_ids(QUERIES))
def test_query_of_the_demo_scene(client, operation, args, expected):
    record = call(client, operation, *args)
    assert result(record) == (m.Success, "OK")
    assert {field: read(record, field) for field in expected} == expected


def test_frame_count(client):
    assert call(client, "GetFrameCount") == FRAMES


REFUSALS = [
    ("GetMarkerNames", ("Carol",), m.ApplicationError, "no subject named 'Carol'"),
    ("GetBoneNames", ("Alice", "Runner"), m.ApplicationError, "subject 'Alice' has no skeleton named 'Runner'"),
    ("GetRootBone", ("Carol", ""), m.ApplicationError, "no subject named 'Carol'"),
    ("GetBoneDetails", ("Alice", "Walker", "Tail"), m.ApplicationError, "subject 'Alice' has no bone named 'Tail'"),
    ("GetConstraintNames", ("Bob", "Runner"), m.ApplicationError, "subject 'Bob' has no skeleton named 'Runner'"),
    ("GetConstraintDetails", ("Bob", "Walker", "LANK_Head"), m.ApplicationError,
     "subject 'Bob' has no constraint named 'LANK_Head'"),
    ("GetSubjectParamNames", ("Carol", "Walker"), m.ApplicationError, "no subject named 'Carol'"),
    ("GetSubjectParamDetails", ("Bob", "Walker", "Age"), m.ApplicationError, "subject 'Bob' has no parameter named 'Age'"),
    ("GetTrajectory", ("Alice", "XYZ"), m.ApplicationError, "subject 'Alice' has no marker named 'XYZ'"),
    ("GetTrajectory", ("alice", "LANK"), m.ApplicationError, "no subject named 'alice'"),
    ("GetTrajectoryAtFrame", ("Bob", "XYZ", 1), m.ApplicationError, "subject 'Bob' has no marker named 'XYZ'"),
    ("GetTrajectoryAtFrame", ("Alice", "LANK", 0), m.InvalidFrameNumber, "frame 0 is outside the take (1 to 1000)"),
    ("GetTrajectoryAtFrame", ("Alice", "LANK", 1001), m.InvalidFrameNumber, "frame 1001 is outside the take (1 to 1000)"),
    ("GetTrajectoryAtFrame", ("Bob", "RANK", -2**31), m.InvalidFrameNumber,
     "frame -2147483648 is outside the take (1 to 1000)"),
    ("GetCommandInfo", ("Frobnicate",), m.ApplicationError, "no command named 'Frobnicate'"),
    ("SetLanguage", ("xx",), m.ApplicationError, "'xx' is not a language of the application (en, de, fr, es, ja, zh)"),
    ("SetLanguage", ("EN",), m.ApplicationError, "'EN' is not a language of the application (en, de, fr, es, ja, zh)"),
    ("Log", ("verbose", "text"), m.ApplicationError, "'verbose' is not a log level (debug, info, warning, error)"),
    ("PSL", ("",), m.ApplicationError, "the command line is empty"),
    ("PSL", ("Frobnicate",), m.ApplicationError, "no command named 'Frobnicate'"),
    ("PSL", ("GetMarkerNames Bob",), m.ApplicationError, "'Bob' is not of the form Name=Value"),
    ("PSL", ('Log Level=info Message="open',), m.ApplicationError, "the command line has an unterminated quote"),
    ("PSL", ("GetFrameCount Frame=3",), m.ApplicationError, "'GetFrameCount' has no parameter named 'Frame'"),
    ("PSL", ("GetTrajectoryAtFrame Subject=Alice Marker=LANK Frame=ten",), m.ApplicationError,
     "parameter 'Frame' of 'GetTrajectoryAtFrame' is not a int: 'ten'"),
    ("PSL", ("GetTrajectoryAtFrame Subject=Alice Marker=LANK Frame=1001",), m.InvalidFrameNumber,
     "frame 1001 is outside the take (1 to 1000)"),
    ("PSL", ("ObjectGetType Object=99999999",), m.ApplicationError, "no object with id 99999999"),
]


@pytest.mark.parametrize("operation, args, code, message", REFUSALS, ids=_ids(REFUSALS))
def test_refusal_carries_the_application_message(client, operation, args, code, message):
    assert result(call(client, operation, *args)) == (code, message)
    # The connection is still good for the next request.
    assert read(ok(call(client, "GetRootBone", "Alice", "")), "Name") == "Pelvis"


@pytest.mark.parametrize("subject", ["Alice", "Bob"])
def test_trajectories_hold_every_frame_and_read_zero_in_their_gaps(client, subject):
    for marker in MARKERS:
        path = trajectory(client, subject, marker)
        assert [len(path[axis]) for axis in "XYZE"] == [FRAMES] * 4
        first, length = GAPS.get((subject, marker), (0, 0))
        unseen = [frame for frame in range(1, FRAMES + 1) if not path["E"][frame - 1]]
        assert unseen == list(range(first, first + length)), marker
        for i in range(FRAMES):
            position = (path["X"][i], path["Y"][i], path["Z"][i])
            if path["E"][i]:
                assert position[2] > 0, (marker, i + 1)
                assert i == 0 or not path["E"][i - 1] or abs(position[0] - path["X"][i - 1]) < 50, (marker, i + 1)
            else:
                assert position == (0, 0, 0), (marker, i + 1)


@pytest.mark.parametrize("subject, marker, frame", [
    ("Alice", "LANK", 1), ("Alice", "LANK", 2), ("Bob", "RWRA", 500), ("Alice", "C7", 701), ("Bob", "LKNE", 1000),
])
def test_trajectory_at_frame_is_element_frame_minus_one(client, subject, marker, frame):
    path = trajectory(client, subject, marker)
    assert at_frame(client, subject, marker, frame) == tuple(path[axis][frame - 1] for axis in "XYZE")


# ---- Changing the scene (each test on an application of its own) -------------------------------------


@pytest.fixture
def writable(start_host):
    return start_host()


def test_set_trajectory_is_read_back_by_every_client(writable, clients):
    writer, reader = clients(writable), clients(writable)
    untouched = trajectory(reader, "Bob", "RANK")
    x = [f * 0.5 for f in range(FRAMES)]
    y = [-1000.0 + f for f in range(FRAMES)]
    z = [1e3 + f / 3 for f in range(FRAMES)]
    e = [f % 7 != 0 for f in range(FRAMES)]
    assert result(call(writer, "SetTrajectory", "Bob", "LANK", x, y, z, e)) == (m.Success, "OK")
    for each in (writer, reader):
        assert trajectory(each, "Bob", "LANK") == {"X": x, "Y": y, "Z": z, "E": e}
    assert at_frame(reader, "Bob", "LANK", 8) == (x[7], y[7], z[7], e[7])
    assert trajectory(reader, "Bob", "RANK") == untouched


@pytest.mark.parametrize("lengths", [(999, 1000, 1000, 1000), (1000, 1001, 1000, 1000), (1000, 1000, 0, 1000),
                                     (1000, 1000, 1000, 999), (0, 0, 0, 0)])
def test_set_trajectory_of_the_wrong_length_is_refused(writable, clients, lengths):
    client = clients(writable)
    before = trajectory(client, "Alice", "LANK")
    x, y, z = ([1.0] * n for n in lengths[:3])
    record = call(client, "SetTrajectory", "Alice", "LANK", x, y, z, [True] * lengths[3])
    given = ", ".join(map(str, lengths))
    assert result(record) == (m.ApplicationError, f"a trajectory needs 1000 frames in X, Y, Z and E (given {given})")
    assert trajectory(client, "Alice", "LANK") == before


def test_request_larger_than_a_frame_is_refused_before_it_is_sent(client):
    frames = 3_000_000  # 25 bytes a frame: more than the 64 MiB a frame may hold
    x = [1.0] * frames
    record = call(client, "SetTrajectory", "Alice", "LANK", x, x, x, [True] * frames)
    code, text = result(record)
    assert code == m.ApplicationError
    assert text.startswith("the request takes 75000") and text.endswith(f"more than the application accepts ({MAX_FRAME})")
    assert m.ZarvoPelluxPostClient_IsConnected(client)
    assert len(trajectory(client, "Alice", "LANK")["X"]) == FRAMES


def test_set_trajectory_at_frame_changes_that_frame_alone(writable, clients):
    writer, reader = clients(writable), clients(writable)
    before = trajectory(reader, "Alice", "RWRA")
    assert result(call(writer, "SetTrajectoryAtFrame", "Alice", "RWRA", 10, 1.5, -2.25, 3.125, False)) == (m.Success, "OK")
    assert at_frame(reader, "Alice", "RWRA", 10) == (1.5, -2.25, 3.125, False)
    after = trajectory(reader, "Alice", "RWRA")
    for axis, value in zip("XYZE", (1.5, -2.25, 3.125, False)):
        before[axis][9] = value
    assert after == before


@pytest.mark.parametrize("subject, marker, frame, code, message", [
    ("Alice", "LANK", 0, m.InvalidFrameNumber, "frame 0 is outside the take (1 to 1000)"),
    ("Alice", "LANK", 1001, m.InvalidFrameNumber, "frame 1001 is outside the take (1 to 1000)"),
    ("Alice", "XYZ", 5, m.ApplicationError, "subject 'Alice' has no marker named 'XYZ'"),
    ("Carol", "LANK", 5, m.ApplicationError, "no subject named 'Carol'"),
])
def test_set_trajectory_at_frame_refused(writable, clients, subject, marker, frame, code, message):
    client = clients(writable)
    before = trajectory(client, "Alice", "LANK")
    assert result(call(client, "SetTrajectoryAtFrame", subject, marker, frame, 1.0, 2.0, 3.0, True)) == (code, message)
    assert trajectory(client, "Alice", "LANK") == before


def test_clients_see_each_others_changes(writable, clients):
    first, second = clients(writable), clients(writable)
    assert call(second, "SetSceneName", "Second take") is True
    assert read(ok(call(first, "GetSceneName")), "Name") == "Second take"
    assert call(first, "SetSceneName", "") is False
    assert read(ok(call(second, "GetSceneName")), "Name") == "Second take"
    ok(call(first, "SetTrajectoryAtFrame", "Bob", "C7", 1000, 7.0, 8.0, 9.0, True))
    assert at_frame(second, "Bob", "C7", 1000) == (7.0, 8.0, 9.0, True)


# ---- The command protocol ------------------------------------------------------------------------------


def test_command_list_holds_every_command(commands):
    library_only = {"Connect", "Disconnect", "IsConnected", "AllocSafeString", "swigregister", "swiginit"}
    prefix = "ZarvoPelluxPostClient_"
    operations = {name[len(prefix):] for name in dir(m) if name.startswith(prefix)} - library_only
    assert len(commands) == len(set(commands))
    assert set(commands) == operations | {"GetServerInfo"}


def test_every_command_is_described(client, commands):
    for name in commands:
        info = ok(call(client, "GetCommandInfo", name))
        description = read(info, "Description")
        assert read(info, "Name") == name
        assert description.endswith(".")
        assert m.Output_GetCommandInfo_DefaultOutputString(info).startswith(f"{name}\n{description}\n----------------\n")


@pytest.mark.parametrize("command, text", [
    ("GetTrajectoryAtFrame",
     "GetTrajectoryAtFrame\nA marker's position and existence flag at one frame.\n"
     "----------------\nInput Parameters\n----------------\nSubject   \nMarker    \nFrame     0\n"
     "-----------------\nOutput Parameters\n-----------------\n"
     "X         double list\nY         double list\nZ         double list\nE         bool list\n"),
    ("GetFrameCount",
     "GetFrameCount\nThe number of frames in the take.\n"
     "----------------\nInput Parameters\n----------------\nNone\n"
     "-----------------\nOutput Parameters\n-----------------\nCount   unsigned int\n"),
    ("SetSceneName",
     "SetSceneName\nRenames the scene.\n"
     "----------------\nInput Parameters\n----------------\nName   \n"
     "-----------------\nOutput Parameters\n-----------------\nNone\n"),
])
def test_command_description_text(client, command, text):
    assert m.Output_GetCommandInfo_DefaultOutputString(ok(call(client, "GetCommandInfo", command))) == text


@pytest.mark.parametrize("command, outputs", [
    ("GetFrameCount", [("Count", "1000")]),
    ("GetSceneName", [("Name", "Demo"), ("Path", "")]),
    ("GetSubjectNames", [("Names", "Alice,Bob"), ("Models", "Walker,Walker"), ("Active", "true,true")]),
    ("GetServerInfo", [("Program", "Pellux Post"), ("MajorVersion", "1"), ("MinorVersion", "0"), ("PointVersion", "0"),
                       ("ReleaseType", "Release")]),
])
def test_process_request_writes_the_outputs_back(client, command, outputs):
    info = ok(call(client, "GetCommandInfo", command))  # the vector lives in this record
    vector = m.Output_GetCommandInfo_InputParameters_get(info)
    assert parameters(client, vector) == []
    record = call(client, "ProcessRequest", command, vector)
    assert result(record) == (m.Success, "OK")
    assert parameters(client, vector) == outputs
    assert parameters(client, m.Output_ProcessRequest_OutputParameters_get(record)) == outputs
    # A vector that came back can be sent again: the output names in it are passed over.
    ok(call(client, "ProcessRequest", command, vector))
    assert parameters(client, vector) == outputs


@pytest.mark.parametrize("command, message", [
    ("Frobnicate", "no command named 'Frobnicate'"),
    ("PSL", "'PSL' cannot be run by name"),
    ("ProcessRequest", "'ProcessRequest' cannot be run by name"),
    ("GetSceneName", "'GetSceneName' has no parameter named 'Count'"),
    ("GetMarkerNames", "'GetMarkerNames' has no parameter named 'Count'"),
])
def test_process_request_refused_leaves_the_vector_alone(client, command, message):
    info = ok(call(client, "GetCommandInfo", "GetFrameCount"))
    counted = m.Output_GetCommandInfo_InputParameters_get(info)
    ok(call(client, "ProcessRequest", "GetFrameCount", counted))
    record = call(client, "ProcessRequest", command, counted)
    assert result(record) == (m.ApplicationError, message)
    assert parameters(client, counted) == [("Count", "1000")]
    assert parameters(client, m.Output_ProcessRequest_OutputParameters_get(record)) == []


@pytest.mark.parametrize("command, defaults, message", [
    ("GetMarkerNames", [("Subject", "")], "no subject named ''"),
    ("GetTrajectoryAtFrame", [("Subject", ""), ("Marker", ""), ("Frame", "0")], "no subject named ''"),
    ("SetSceneName", [("Name", "")], "a scene name cannot be empty"),
    ("ObjectGetPath", [("Object", "0")], "no object with id 0"),
])
def test_process_request_with_the_described_defaults(client, command, defaults, message):
    info = ok(call(client, "GetCommandInfo", command))
    vector = m.Output_GetCommandInfo_InputParameters_get(info)
    assert parameters(client, vector) == defaults
    assert result(call(client, "ProcessRequest", command, vector)) == (m.ApplicationError, message)
    assert parameters(client, vector) == defaults


@pytest.mark.parametrize("line, answer", [
    ("GetMarkerNames Subject=Bob", "Names=" + ",".join(MARKERS) + "\n"),
    ('GetRootBone Subject="Alice"', "Name=Pelvis\n"),
    ("GetFrameCount", "Count=1000\n"),
    ("GetSubjectParamDetails Subject=Bob Skeleton=Walker Parameter=Mass", "Value=72.8\nDefaultValue=70\nUnit=kg\nRequired=true\n"),
    ("GetConstraintDetails Subject=Alice Skeleton=Walker Constraint=LANK_LeftFoot",
     "Active=true\nSource=LANK\nTarget=LeftFoot\nOffset=0,24,0\nType=Point\n"),
    ("GetTrajectoryAtFrame  Subject=Alice\tMarker=C7 Frame=701", "X=0\nY=0\nZ=0\nE=false\n"),
    ("SetLanguage Language=ja", ""),
])
def test_psl_answers_with_name_value_lines(client, line, answer):
    assert read(ok(call(client, "PSL", line)), "Str") == answer


@pytest.mark.parametrize("language", ["en", "de", "fr", "es", "ja", "zh"])
def test_set_language(client, language):
    assert result(call(client, "SetLanguage", language)) == (m.Success, "OK")


def test_log_lands_in_the_application_log(client, host):
    note = f"note {uuid.uuid4().hex}"
    ok(call(client, "Log", "warning", note + "\nforged line"))
    ok(call(client, "PSL", f'Log Level=debug Message="{note} \\"quoted\\""'))
    log = host.log()
    assert f" warning {note}\\nforged line\n" in log
    assert f' debug {note} "quoted"\n' in log


# ---- Result codes from real conditions --------------------------------------------------------------------

FAULTS = [
    # fault, operation, its arguments, code, message, whether the connection survives
    ("garbage@GetSceneName", "GetSceneName", (), m.ReplyParsingError, PARSING, True),
    ("oversize@GetSceneName", "GetSceneName", (), m.ReplyParsingError, PARSING, False),
    ("close@GetSceneName", "GetSceneName", (), m.NotConnected, NOT_CONNECTED, False),
    ("text@GetSubjectParamDetails", "GetSubjectParamDetails", ("Bob", "Walker", "Mass"), m.ConversionError, CONVERSION, True),
    ("text@GetConstraintDetails", "GetConstraintDetails", ("Bob", "", "C7_Thorax"), m.ConversionError, CONVERSION, True),
    ("frames=2", "GetTrajectoryAtFrame", ("Alice", "LANK", 5), m.ExpectedOneFrame, ONE_FRAME, True),
    ("frames=0", "GetTrajectoryAtFrame", ("Alice", "LANK", 5), m.ExpectedOneFrame, ONE_FRAME, True),
    ("status=77@GetSceneName", "GetSceneName", (), m.UnknownStatus, "Unknown Error", True),
    ("status=-1@GetRootBone", "GetRootBone", ("Bob", ""), m.UnknownStatus, "Unknown Error", True),
    ("status=1004@GetSceneName", "GetSceneName", (), m.InvalidFrameNumber, "Frame number specified is invalid.", True),
]


@pytest.mark.parametrize("fault, operation, args, code, message, survives", FAULTS, ids=[f[0] for f in FAULTS])
def test_fault_gives_its_result_code(start_host, clients, fault, operation, args, code, message, survives):
    client = clients(start_host("--fault", fault))
    assert result(call(client, operation, *args)) == (code, message)
    assert call(client, "IsConnected") is survives
    following = call(client, "GetSubjectNames")
    if survives:
        assert read(ok(following), "Names") == ["Alice", "Bob"]
    else:
        assert result(following) == (m.NotConnected, NOT_CONNECTED)


def test_timed_out_request_and_its_late_reply(start_host, clients):
    host = start_host("--fault", "delay=1000@GetSceneName", "--fault", "delay=1000@GetFrameCount")
    client = clients(host, "timeout=300")
    started = time.monotonic()
    assert result(call(client, "GetSceneName")) == (m.RequestTimedOut, TIMED_OUT)
    assert time.monotonic() - started > 0.25
    assert call(client, "IsConnected") is True
    # Once the late reply has come, the next request must get its own reply and never that one.
    time.sleep(1.2)
    assert read(ok(call(client, "GetSubjectNames")), "Models") == ["Walker", "Walker"]
    assert call(client, "GetFrameCount") == 0
    time.sleep(1.2)
    assert read(ok(call(client, "GetMarkerNames", "Alice")), "Names") == MARKERS


@pytest.mark.skipif(not os.path.exists("/proc/self/statm"), reason="resident memory is read from /proc")
def test_a_reply_announced_and_never_sent_takes_no_memory(start_host, clients):
    client = clients(start_host("--fault", "announce@GetSceneName"), "timeout=300")
    before = repeat.resident()
    assert result(call(client, "GetSceneName")) == (m.RequestTimedOut, TIMED_OUT)
    assert repeat.resident() - before < 8 << 20  # the announced reply is 64 MiB
    # The rest of that reply could no longer be told from the next one's.
    assert call(client, "IsConnected") is False


def test_the_buffer_of_a_large_reply_is_let_go(start_host, clients):
    in_use = repeat.heap_meter()
    if in_use is None:
        pytest.skip("the C heap's use is not measurable here")
    client = clients(start_host("--frames", "1000000"))
    before = in_use()
    m.delete_Output_GetTrajectory(ok(call(client, "GetTrajectory", "Alice", "LANK")))
    assert in_use() - before < 1 << 20  # the reply is 25 MiB


@pytest.mark.parametrize("fault, count", [
    ("delay=1000@GetFrameCount", 0), ("garbage@GetFrameCount", 0), ("text@GetFrameCount", 0),
    ("status=1003@GetFrameCount", 0), ("close@GetFrameCount", 0), ("oversize@GetFrameCount", 0),
    ("garbage@GetSceneName", 250),
])
def test_frame_count_is_zero_when_the_command_fails(start_host, clients, fault, count):
    client = clients(start_host("--frames", "250", "--fault", fault), "timeout=300")
    assert call(client, "GetFrameCount") == count


# ---- An application that keeps serving ---------------------------------------------------------------------


def frame(payload):
    return struct.pack("<I", len(payload)) + payload


def hello(count, version=1):
    return frame(b"HZPP1" + struct.pack("<HHI", version, count, 0))


def text_value(text):
    data = text.encode()
    return b"\x01" + struct.pack("<I", len(data)) + data


def request(number, command, *inputs):
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
    assert payload[:1] == b"E"
    return payload[5:5 + struct.unpack_from("<I", payload, 1)[0]].decode()


def raw_connection(host, receive_buffer=None):
    sock = socket.socket(socket.AF_INET, socket.SOCK_STREAM)
    sock.settimeout(5)
    if receive_buffer:
        sock.setsockopt(socket.SOL_SOCKET, socket.SO_RCVBUF, receive_buffer)
    sock.connect((host.address, host.port))
    return sock


def reset_on_close(sock):
    sock.setsockopt(socket.SOL_SOCKET, socket.SO_LINGER, struct.pack("ii", 1, 0))


def shake_hands(sock, count):
    sock.sendall(hello(count))
    assert read_frame(sock) == b"H" + struct.pack("<HH", 1, count)


PEERS = [
    # what the peer sends, given the number of commands; whether it shook hands first; the refusal it
    # gets before the application closes the connection (None: closed without a word)
    ("http before hello", lambda n: b"GET / HTTP/1.1\r\nHost: localhost\r\n\r\n", False, None),
    ("frame that is no hello", lambda n: frame(b"garbage!"), False, "this is not a client of the application"),
    ("hello of another version", lambda n: hello(n, version=2), False,
     "this application speaks version 1 of the protocol with {n} commands"),
    ("hello with other commands", lambda n: hello(n - 1), False,
     "this application speaks version 1 of the protocol with {n} commands"),
    ("oversized before hello", lambda n: struct.pack("<I", MAX_FRAME + 1), False, None),
    ("oversized after hello", lambda n: struct.pack("<I", MAX_FRAME + 1), True, f"a frame may hold at most {MAX_FRAME} bytes"),
    ("empty after hello", lambda n: struct.pack("<I", 0), True, f"a frame may hold at most {MAX_FRAME} bytes"),
    ("no request after hello", lambda n: frame(b"\x00" + bytes(range(200))), True, "a frame that is not a request"),
]


@pytest.mark.parametrize("sent, after_hello, refused", [p[1:] for p in PEERS], ids=[p[0] for p in PEERS])
def test_misbehaving_peer_is_refused_and_closed(start_host, clients, commands, sent, after_hello, refused):
    host = start_host()
    with raw_connection(host) as sock:
        if after_hello:
            shake_hands(sock, len(commands))
        sock.sendall(sent(len(commands)))
        if refused:
            assert refusal(read_frame(sock)) == refused.format(n=len(commands))
        assert read_frame(sock) is None
    assert_serves(host, clients)


def test_a_frame_begun_must_end_within_30_seconds(start_host, clients, commands):
    host = start_host()
    with raw_connection(host) as sock:
        shake_hands(sock, len(commands))
        sock.sendall(struct.pack("<I", 100) + b"Q")  # 99 of its bytes never come
        started = time.monotonic()
        sock.settimeout(45)
        assert read_frame(sock) is None
        assert 29 < time.monotonic() - started < 45
    assert_serves(host, clients)


MALFORMED = [
    # the request, given the list of commands; the code and message of its reply (None: no such command)
    (lambda c: request(7, len(c)), m.ApplicationError, None),
    (lambda c: request(7, c.index("GetMarkerNames"), b"\x02" + struct.pack("<i", 5)), m.ApplicationError,
     "the request for 'GetMarkerNames' does not match the command: a value has the wrong type"),
    (lambda c: request(7, c.index("GetMarkerNames"), text_value("Bob")[:-1]), m.ApplicationError,
     "the request for 'GetMarkerNames' does not match the command: the frame ends too early"),
    (lambda c: request(7, c.index("GetFrameCount"), text_value("extra")), m.ApplicationError,
     "the request for 'GetFrameCount' does not match the command: the frame has more values than the command takes"),
    (lambda c: request(7, c.index("GetRootBone"), text_value("Bob"), text_value("Walker")), m.Success, ""),
]


@pytest.mark.parametrize("request_frame, code, message", MALFORMED,
                         ids=["unknown command", "wrong type", "too short", "too long", "well formed"])
def test_malformed_request_is_refused_and_the_connection_stays(host, commands, request_frame, code, message):
    with raw_connection(host) as sock:
        shake_hands(sock, len(commands))
        sock.sendall(request_frame(commands))
        number, got, text = reply(read_frame(sock))
        assert (number, got) == (7, code)
        assert text == (message if message is not None else f"no command number {len(commands)}")
        sock.sendall(request(8, commands.index("GetFrameCount")))
        assert read_frame(sock) == b"R" + struct.pack("<IiI", 8, 0, 0) + b"\x03" + struct.pack("<I", FRAMES)


def test_random_frames_are_answered_or_refused(start_host, clients, commands):
    host = start_host()
    rng = random.Random(20261123)
    deadline = time.monotonic() + 20
    for turn in range(60):
        assert time.monotonic() < deadline
        body = bytes(rng.randrange(256) for _ in range(rng.randrange(1, 48)))
        with raw_connection(host) as sock:
            shake_hands(sock, len(commands))
            if turn % 2:
                sock.sendall(frame(bytes([rng.choice(b"HRE\x00\xff")]) + body))
                assert refusal(read_frame(sock)) == "a frame that is not a request"
                assert read_frame(sock) is None
            else:
                sock.sendall(request(turn + 1, rng.randrange(len(commands) + 10), body))
                assert reply(read_frame(sock))[:2] == (turn + 1, m.ApplicationError)
                sock.sendall(request(turn + 2, commands.index("GetFrameCount")))
                assert reply(read_frame(sock))[:2] == (turn + 2, m.Success)
    assert_serves(host, clients)


@pytest.mark.parametrize("case", ["truncated frame", "request then gone", "many requests then reset", "half a hello"])
def test_client_that_vanishes_mid_request(start_host, clients, commands, case):
    host = start_host()
    whole = commands.index("GetTrajectory")
    sock = raw_connection(host, receive_buffer=4096)
    if case != "half a hello":
        shake_hands(sock, len(commands))
    if case == "truncated frame":
        sent = request(1, whole, text_value("Alice"), text_value("LANK"))
        sock.sendall(sent[:len(sent) - 3])
    elif case == "request then gone":
        sock.sendall(request(1, whole, text_value("Alice"), text_value("LANK")))
    elif case == "many requests then reset":
        sock.sendall(b"".join(request(n, whole, text_value("Bob"), text_value(MARKERS[n % 12])) for n in range(1, 41)))
        reset_on_close(sock)
    else:
        sock.sendall(hello(len(commands))[:9])
    sock.close()
    assert_serves(host, clients)


def test_library_client_deleted_while_its_reply_is_on_the_way(start_host, clients):
    host = start_host("--fault", "delay=400@GetTrajectory")
    client = new_client()
    ok(connect(client, host, "timeout=100"))
    assert result(call(client, "GetTrajectory", "Alice", "LANK")) == (m.RequestTimedOut, TIMED_OUT)
    m.delete_ZarvoPelluxPostClient(client)
    time.sleep(0.5)
    assert_serves(host, clients)


def test_many_connections_opened_and_dropped(start_host, clients, commands):
    host = start_host()
    deadline = time.monotonic() + 30
    for batch in range(4):
        held = []
        for i in range(50):
            sock = raw_connection(host)
            if i % 3 == 1:
                sock.sendall(hello(len(commands)))
            elif i % 3 == 2:
                sock.sendall(hello(len(commands))[:6])
                reset_on_close(sock)
            held.append(sock)
        for sock in held:
            sock.close()
        assert time.monotonic() < deadline
    assert_serves(host, clients)


@pytest.mark.parametrize("stop", [signal.SIGTERM, signal.SIGINT], ids=["SIGTERM", "SIGINT"])
def test_stop_signal_ends_the_application_with_status_zero(start_host, clients, commands, stop):
    host = start_host()
    connected = clients(host)
    with raw_connection(host) as idle:
        shake_hands(idle, len(commands))
        assert host.stop(stop) == 0
        assert read_frame(idle) is None
    assert host.log().endswith(" info stopped\n")
    assert wait_until(lambda: call(connected, "IsConnected") is False)


def test_the_exit_fault_ends_the_application_at_that_commands_nth_request(start_host, clients):
    host = start_host("--fault", "exit=2@GetFrameCount")
    client = clients()
    ok(connect(client, host))
    assert result(call(client, "GetSubjectNames")) == (m.Success, "OK")  # other commands do not count
    assert call(client, "GetFrameCount") == 1000
    assert call(client, "GetFrameCount") == 0  # no reply: the application is gone
    assert host.process.wait(10) == 3


def test_watch_stdin_stops_the_application_at_the_end_of_its_input(start_host):
    host = start_host("--watch-stdin")  # its standard input is empty
    assert host.process.wait(10) == 0
    assert host.log().endswith(" info stopped\n")
