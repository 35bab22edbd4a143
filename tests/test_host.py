"""The client against the real application: the connection's life, the scene, subject, trajectory and
command-protocol operations on the demo scene, each result code provoked by a real condition, and an
application that keeps serving after peers misbehave on the wire (test_netfuzz.py sends many more
kinds of bad frames, at random).

Tests that change the scene start an application of their own, so that the shared one stays as the
demo scene was made and the order of the tests does not matter."""
import os
import signal
import struct
import time
import uuid
from datetime import datetime, timedelta

import pytest

import _Client3 as m
import repeat
from hostproc import (MAX_FRAME, NOT_CONNECTED, Client, commands, frame, hello, int_value, parameters, plain,
                      raw_connection, read_frame, refusal, reply, request, text_value, wait_until)

COMMANDS = commands()
FRAMES = 1000
MARKERS = "LFHD RFHD C7 STRN LASI RASI LWRA RWRA LKNE RKNE LANK RANK".split()
MARKER_BONES = "Head Head Thorax Thorax Pelvis Pelvis LeftHand RightHand LeftShin RightShin LeftFoot RightFoot".split()
BONES = ("Pelvis Thorax Head LeftArm LeftHand RightArm RightHand LeftThigh LeftShin LeftFoot RightThigh RightShin "
         "RightFoot").split()
CONSTRAINTS = [f"{marker}_{bone}" for marker, bone in zip(MARKERS, MARKER_BONES)]
TIMED_OUT = "Host application failed to respond to the information request."
PARSING = "Unable to interpret information sent from the host application."
REFUSED = "Host application encountered an error processing the request."
CONVERSION = "Unable to convert output parameter to a numeric value."
ONE_FRAME = "Invalid number of frames returned, expected one frame."
ON_LINUX = pytest.mark.skipif(not os.path.exists("/proc/net/tcp"), reason="reads the connections from /proc/net/tcp")


def unread_bytes(port):
    """The bytes that wait unread in this machine's connections to `port` (Linux's /proc/net/tcp)."""
    with open("/proc/net/tcp") as table:
        rows = [line.split() for line in table.readlines()[1:]]
    return sum(int(row[4].split(":")[1], 16) for row in rows if int(row[2].split(":")[1], 16) == port)


def shake_hands(sock):
    sock.sendall(hello())
    assert read_frame(sock) == b"H" + struct.pack("<HH", 1, len(COMMANDS))


@pytest.fixture
def client(host, clients):
    return clients(host)


def assert_serves(host, clients):
    """The application still runs and answers a well-behaved client correctly."""
    assert host.running()
    client = clients(host)
    assert client.GetMarkerNames("Alice") == MARKERS
    assert client.GetFrameCount() == FRAMES
    assert client.GetTrajectoryAtFrame("Bob", "STRN", 522) == (0.0, 0.0, 0.0, False)


# ---- Connection life -----------------------------------------------------------------------------


def test_connection_life(host, clients):
    client = clients()
    assert client.IsConnected() is False
    assert m.SafeString_Value(client.AllocSafeString("made by the library")) == "made by the library"

    assert client.result("Connect", host.address, host.port) == (m.Success, "OK")
    assert client.IsConnected() is True

    assert client.Disconnect() is None
    assert client.IsConnected() is False
    assert client.result("GetSubjectNames") == (m.NotConnected, NOT_CONNECTED)
    assert client.SetSceneName("Renamed") is False

    client.Connect(host.address, host.port)
    assert client.GetSceneName() == ("Demo", "")


@pytest.mark.parametrize("address", ["", "127.0.0.1?timeout=0", "localhost?connect=2000&timeout=5000"])
def test_connect_address_forms(start_host, clients, address):
    host = start_host("--fault", "delay=200@GetSubjectNames")  # a reply that keeps the client waiting
    client = clients()
    assert client.result("Connect", address, host.port) == (m.Success, "OK")
    assert client.GetSubjectNames()[0] == ["Alice", "Bob"]


def test_second_connect_replaces_the_first(start_host, clients):
    only_one = start_host("--max-clients", "1")
    empty = start_host("--scene", "empty", "--frames", "10")
    client = clients(only_one)
    refused = clients()
    assert refused.result("Connect", only_one.address, only_one.port) == (
        m.ApplicationError, f"{REFUSED} 127.0.0.1:{only_one.port} refused the client: the application serves at most 1 clients at once")
    assert refused.IsConnected() is False

    client.Connect(empty.address, empty.port)
    assert client.GetSceneName()[0] == "Untitled"
    assert client.GetFrameCount() == 10
    # The first connection was closed: its place at the application is free again.
    assert wait_until(lambda: refused.result("Connect", only_one.address, only_one.port)[0] == m.Success)


def test_records_outlive_their_client(host):
    client = Client(host)
    names = client.record("GetMarkerNames", "Bob")
    path = client.record("GetTrajectory", "Alice", "RANK")
    client.close()
    del client
    assert plain(m.Output_GetMarkerNames_Names_get(names)) == MARKERS
    seen = plain(m.Output_GetTrajectory_E_get(path))
    assert len(seen) == FRAMES and seen[400:435] == [False] * 35


# ---- Scene, subjects and trajectories on the demo scene ---------------------------------------------

QUERIES = [
    ("GetBoneNames", ("Alice", "Walker"), BONES),
    ("GetBoneDetails", ("Alice", "Walker", "Pelvis"), ("", ["Thorax", "LeftThigh", "RightThigh"])),
    ("GetConstraintNames", ("Bob", "Walker"), CONSTRAINTS),
    ("GetConstraintDetails", ("Bob", "", "RASI_Pelvis"),
     (True, "RASI", "Pelvis", pytest.approx([18.2, -31.2, 0], rel=1e-6), "Point")),
    ("GetSubjectParamDetails", ("Bob", "", "RightLegLength"), (pytest.approx(988.0, rel=1e-6), 900, "mm", False)),
]


def _ids(table):
    return ["-".join(map(str, (row[0], *row[1]))) for row in table]


@pytest.mark.parametrize("operation, args, expected", QUERIES, ids=_ids(QUERIES))
def test_query_of_the_demo_scene(client, operation, args, expected):
    assert getattr(client, operation)(*args) == expected


REFUSALS = [
    ("GetBoneNames", ("Alice", "Runner"), m.ApplicationError, "subject 'Alice' has no skeleton named 'Runner'"),
    ("GetBoneDetails", ("Alice", "Walker", "Tail"), m.ApplicationError, "subject 'Alice' has no bone named 'Tail'"),
    ("GetConstraintDetails", ("Bob", "Walker", "LANK_Head"), m.ApplicationError,
     "subject 'Bob' has no constraint named 'LANK_Head'"),
    ("GetTrajectory", ("alice", "LANK"), m.ApplicationError, "no subject named 'alice'"),
    ("GetTrajectoryAtFrame", ("Bob", "XYZ", 1), m.ApplicationError, "subject 'Bob' has no marker named 'XYZ'"),
    ("GetTrajectoryAtFrame", ("Alice", "LANK", 0), m.InvalidFrameNumber, "frame 0 is outside the take (1 to 1000)"),
    ("GetTrajectoryAtFrame", ("Alice", "LANK", 1001), m.InvalidFrameNumber, "frame 1001 is outside the take (1 to 1000)"),
    ("GetCommandInfo", ("Frobnicate",), m.ApplicationError, "no command named 'Frobnicate'"),
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
    assert client.result(operation, *args) == (code, message)
    # The connection is still good for the next request.
    assert client.GetRootBone("Alice", "") == "Pelvis"


@pytest.mark.parametrize("subject, marker, frame", [
    ("Alice", "LANK", 1), ("Bob", "LKNE", 1000),
])
def test_trajectory_at_frame_is_element_frame_minus_one(client, subject, marker, frame):
    whole = client.GetTrajectory(subject, marker)
    assert client.GetTrajectoryAtFrame(subject, marker, frame) == tuple(axis[frame - 1] for axis in whole)


# ---- Changing the scene (each test on an application of its own) -------------------------------------


@pytest.fixture
def writable(start_host):
    return start_host()


def test_writes_are_read_back_by_every_client(writable, clients):
    writer, reader = clients(writable), clients(writable)
    untouched = reader.GetTrajectory("Bob", "RANK")
    x = [f * 0.5 for f in range(FRAMES)]
    y = [-1000.0 + f for f in range(FRAMES)]
    z = [1e3 + f / 3 for f in range(FRAMES)]
    e = [f % 7 != 0 for f in range(FRAMES)]
    assert writer.result("SetTrajectory", "Bob", "LANK", x, y, z, e) == (m.Success, "OK")
    for each in (writer, reader):
        assert each.GetTrajectory("Bob", "LANK") == (x, y, z, e)
    assert reader.GetTrajectory("Bob", "RANK") == untouched
    assert writer.SetSceneName("Second take") is True
    assert reader.GetSceneName()[0] == "Second take"


@pytest.mark.parametrize("lengths", [(999, 1000, 1000, 1000), (1000, 1001, 1000, 1000), (1000, 1000, 0, 1000),
                                     (1000, 1000, 1000, 999)])
def test_set_trajectory_of_the_wrong_length_is_refused(writable, clients, lengths):
    client = clients(writable)
    before = client.GetTrajectory("Alice", "LANK")
    x, y, z = ([1.0] * n for n in lengths[:3])
    given = ", ".join(map(str, lengths))
    assert client.result("SetTrajectory", "Alice", "LANK", x, y, z, [True] * lengths[3]) == (
        m.ApplicationError, f"a trajectory needs 1000 frames in X, Y, Z and E (given {given})")
    assert client.GetTrajectory("Alice", "LANK") == before


def test_request_larger_than_a_frame_is_refused_before_it_is_sent(client):
    frames = 3_000_000  # 25 bytes a frame: more than the 64 MiB a frame may hold
    x = [1.0] * frames
    code, text = client.result("SetTrajectory", "Alice", "LANK", x, x, x, [True] * frames)
    assert code == m.ApplicationError
    assert text.startswith("the request takes 75000") and text.endswith(f"more than the application accepts ({MAX_FRAME})")
    assert client.IsConnected()
    assert len(client.GetTrajectory("Alice", "LANK")[0]) == FRAMES


def test_set_trajectory_at_frame_changes_that_frame_alone(writable, clients):
    writer, reader = clients(writable), clients(writable)
    before = reader.GetTrajectory("Alice", "RWRA")
    writer.SetTrajectoryAtFrame("Alice", "RWRA", 10, 1.5, -2.25, 3.125, False)
    for axis, value in zip(before, (1.5, -2.25, 3.125, False)):
        axis[9] = value
    assert reader.GetTrajectory("Alice", "RWRA") == before
    # A frame outside the take is refused, and changes nothing.
    assert writer.result("SetTrajectoryAtFrame", "Alice", "RWRA", 1001, 1.0, 2.0, 3.0, True) == (
        m.InvalidFrameNumber, "frame 1001 is outside the take (1 to 1000)")
    assert reader.GetTrajectory("Alice", "RWRA") == before


# ---- The command protocol ------------------------------------------------------------------------------


def test_command_list_is_every_command_in_the_order_of_their_numbers(client):
    assert client.GetCommandList() == list(COMMANDS)


def test_command_description_text(client):
    """The inputs' defaults and the outputs' types, as the application describes them."""
    assert m.Output_GetCommandInfo_DefaultOutputString(client.record("GetCommandInfo", "GetTrajectoryAtFrame")) == (
        "GetTrajectoryAtFrame\nA marker's position and existence flag at one frame.\n"
        "----------------\nInput Parameters\n----------------\nSubject   \nMarker    \nFrame     0\n"
        "-----------------\nOutput Parameters\n-----------------\n"
        "X         double list\nY         double list\nZ         double list\nE         bool list\n")


def test_process_request_writes_the_outputs_back(client):
    outputs = [("Program", "Pellux Post"), ("MajorVersion", "1"), ("MinorVersion", "0"), ("PointVersion", "0"),
               ("ReleaseType", "Release")]
    info = client.record("GetCommandInfo", "GetServerInfo")  # the vector lives in this record
    vector = m.Output_GetCommandInfo_InputParameters_get(info)
    assert parameters(vector) == []
    record = client.record("ProcessRequest", "GetServerInfo", vector)
    assert client.result("ProcessRequest", "GetServerInfo", vector) == (m.Success, "OK")
    assert parameters(vector) == outputs
    assert parameters(m.Output_ProcessRequest_OutputParameters_get(record)) == outputs
    # A vector that came back can be sent again: the output names in it are passed over.
    client.ProcessRequest("GetServerInfo", vector)
    assert parameters(vector) == outputs


@pytest.mark.parametrize("command, message", [
    ("PSL", "'PSL' cannot be run by name"),
    ("GetSceneName", "'GetSceneName' has no parameter named 'Count'"),
])
def test_process_request_refused_leaves_the_vector_alone(client, command, message):
    info = client.record("GetCommandInfo", "GetFrameCount")
    counted = m.Output_GetCommandInfo_InputParameters_get(info)
    client.ProcessRequest("GetFrameCount", counted)
    record = client.record("ProcessRequest", command, counted)
    assert (m.Output_Result_Result_get(record), m.SafeString_Value(m.Output_Result_ResultString_get(record))) == (
        m.ApplicationError, message)
    assert parameters(counted) == [("Count", "1000")]
    assert parameters(m.Output_ProcessRequest_OutputParameters_get(record)) == []


@pytest.mark.parametrize("line, answer", [
    ("GetMarkerNames Subject=Bob", "Names=" + ",".join(MARKERS) + "\n"),
    ("GetSubjectParamDetails Subject=Bob Skeleton=Walker Parameter=Mass", "Value=72.8\nDefaultValue=70\nUnit=kg\nRequired=true\n"),
    ("GetConstraintDetails Subject=Alice Skeleton=Walker Constraint=LANK_LeftFoot",
     "Active=true\nSource=LANK\nTarget=LeftFoot\nOffset=0,24,0\nType=Point\n"),
    ("GetTrajectoryAtFrame  Subject=Alice\tMarker=C7 Frame=701", "X=0\nY=0\nZ=0\nE=false\n"),
    ("SetLanguage Language=ja", ""),
])
def test_psl_answers_with_name_value_lines(client, line, answer):
    assert client.PSL(line) == answer


def test_log_lands_in_the_application_log(client, host):
    note = f"note {uuid.uuid4().hex}"
    client.Log("warning", note + "\nforged line")
    client.PSL(f'Log Level=debug Message="{note} \\"quoted\\""')
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
    ("frames=2", "GetTrajectoryAtFrame", ("Alice", "LANK", 5), m.ExpectedOneFrame, ONE_FRAME, True),
    ("frames=0", "GetTrajectoryAtFrame", ("Alice", "LANK", 5), m.ExpectedOneFrame, ONE_FRAME, True),
    ("status=-1@GetRootBone", "GetRootBone", ("Bob", ""), m.UnknownStatus, "Unknown Error", True),
    ("status=1004@GetSceneName", "GetSceneName", (), m.InvalidFrameNumber, "Frame number specified is invalid.", True),
]


@pytest.mark.parametrize("fault, operation, args, code, message, survives", FAULTS, ids=[f[0] for f in FAULTS])
def test_fault_gives_its_result_code(start_host, clients, fault, operation, args, code, message, survives):
    client = clients(start_host("--fault", fault))
    assert client.result(operation, *args) == (code, message)
    assert client.IsConnected() is survives
    following = client.result("GetSubjectNames")
    assert following == ((m.Success, "OK") if survives else (m.NotConnected, NOT_CONNECTED))


@ON_LINUX
def test_timed_out_request_and_its_late_reply(start_host, clients):
    host = start_host("--fault", "delay=600@GetSceneName")
    client = clients(host, "timeout=300")
    started = time.monotonic()
    assert client.result("GetSceneName") == (m.RequestTimedOut, TIMED_OUT)
    assert time.monotonic() - started > 0.25
    assert client.IsConnected() is True
    # Once the late reply has come, the next request must get its own reply and never that one.
    assert wait_until(lambda: unread_bytes(host.port) > 0)
    assert client.GetSubjectNames()[1] == ["Walker", "Walker"]


@pytest.mark.skipif(not os.path.exists("/proc/self/statm"), reason="resident memory is read from /proc")
def test_a_reply_announced_and_never_sent_takes_no_memory(start_host, clients):
    client = clients(start_host("--fault", "announce@GetSceneName"), "timeout=300")
    before = repeat.resident()
    assert client.result("GetSceneName") == (m.RequestTimedOut, TIMED_OUT)
    assert repeat.resident() - before < 8 << 20  # the announced reply is 64 MiB
    # The rest of that reply could no longer be told from the next one's.
    assert client.IsConnected() is False


def test_the_buffer_of_a_large_reply_is_let_go(start_host, clients):
    in_use = repeat.heap_meter()
    if in_use is None:
        pytest.skip("the C heap's use is not measurable here")
    client = clients(start_host("--frames", "400000"))
    before = in_use()
    m.delete_Output_GetTrajectory(client.record("GetTrajectory", "Alice", "LANK"))
    assert in_use() - before < 1 << 20  # the reply is 10 MB


def test_frame_count_is_zero_when_the_command_fails(start_host, clients):
    client = clients(start_host("--fault", "status=1003@GetFrameCount"))
    assert client.GetFrameCount() == 0


# ---- An application that keeps serving ---------------------------------------------------------------------

PEERS = [
    # what the peer sends instead of its hello; the refusal it gets before the application closes the
    # connection (None: closed without a word)
    ("frame that is no hello", frame(b"garbage!"), "this is not a client of the application"),
    ("hello of another version", hello(version=2),
     f"this application speaks version 1 of the protocol with {len(COMMANDS)} commands"),
    ("hello with other commands", hello(count=len(COMMANDS) - 1),
     f"this application speaks version 1 of the protocol with {len(COMMANDS)} commands"),
    ("oversized before hello", struct.pack("<I", MAX_FRAME + 1), None),
]


@pytest.mark.parametrize("sent, refused", [p[1:] for p in PEERS], ids=[p[0] for p in PEERS])
def test_misbehaving_peer_is_refused_and_closed(start_host, clients, sent, refused):
    host = start_host()
    with raw_connection(host) as sock:
        sock.sendall(sent)
        if refused:
            assert refusal(read_frame(sock)) == refused
        assert read_frame(sock) is None
    assert_serves(host, clients)


def test_a_frame_begun_must_end_within_30_seconds(start_host, clients):
    host = start_host()
    with raw_connection(host) as sock:
        shake_hands(sock)
        sock.sendall(struct.pack("<I", 100) + b"Q")  # 99 of its bytes never come
        started = time.monotonic()
        sock.settimeout(45)
        assert read_frame(sock) is None
        assert 29 < time.monotonic() - started < 45
    assert_serves(host, clients)


MALFORMED = [
    # the request; the code and message of its reply
    (request(7, "GetMarkerNames", int_value(5)), m.ApplicationError,
     "the request for 'GetMarkerNames' does not match the command: a value has the wrong type"),
    (request(7, "GetMarkerNames", text_value("Bob")[:-1]), m.ApplicationError,
     "the request for 'GetMarkerNames' does not match the command: the frame ends too early"),
    (request(7, "GetFrameCount", text_value("extra")), m.ApplicationError,
     "the request for 'GetFrameCount' does not match the command: the frame has more values than the command takes"),
    (request(7, "GetRootBone", text_value("Bob"), text_value("Walker")), m.Success, ""),
]


@pytest.mark.parametrize("sent, code, message", MALFORMED,
                         ids=["wrong type", "too short", "too long", "well formed"])
def test_malformed_request_is_refused_and_the_connection_stays(host, sent, code, message):
    with raw_connection(host) as sock:
        shake_hands(sock)
        sock.sendall(sent)
        assert reply(read_frame(sock)) == (7, code, message)
        sock.sendall(request(8, "GetFrameCount"))
        assert read_frame(sock) == b"R" + struct.pack("<IiI", 8, 0, 0) + b"\x03" + struct.pack("<I", FRAMES)


@pytest.mark.parametrize("stop", [signal.SIGTERM, signal.SIGINT], ids=["SIGTERM", "SIGINT"])
def test_stop_signal_ends_the_application_with_status_zero(start_host, clients, stop):
    host = start_host()
    connected = clients(host)
    with raw_connection(host) as idle:
        shake_hands(idle)
        assert host.stop(stop) == 0
        assert read_frame(idle) is None
    assert host.log().endswith(" info stopped\n")
    stamp = datetime.strptime(host.log().splitlines()[-1][:19], "%Y-%m-%d %H:%M:%S")
    assert abs(datetime.now() - stamp) < timedelta(minutes=2)  # the log's times are local
    assert wait_until(lambda: connected.IsConnected() is False)


def test_watch_stdin_stops_the_application_at_the_end_of_its_input(start_host):
    host = start_host()  # started with --watch-stdin, its input held by this process
    host.process.stdin.close()
    assert host.process.wait(10) == 0
    assert host.log().endswith(" info stopped\n")
