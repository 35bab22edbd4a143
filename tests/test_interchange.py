"""Importing and exporting trajectories against real hosts: C3D files checked with an independent
reader and writer (the `c3d` package), CSV files with Python's csv module, both round trips, merge
and replace, and damaged or hostile files refused with the scene left as it was."""
import csv
import struct

import _Client3 as m
import c3d
import numpy as np
import pytest

from c3dfiles import independent

# The independent writer warns about every file without analog channels.
pytestmark = pytest.mark.filterwarnings("ignore:No analog data found")


@pytest.fixture
def frames():
    return 50


def trajectories(app):
    """Every marker's trajectory by SUBJECT:MARKER, in the order of the tree."""
    return {f"{s}:{mk}": app.GetTrajectory(s, mk) for s in app.GetSubjectNames()[0] for mk in app.GetMarkerNames(s)}


def seen(trajectories):
    """Trajectories with the positions of frames where the marker is not seen left out: files keep
    keys only, not what a channel holds between them."""
    return {name: tuple([v if s else None for v, s in zip(axis, e)] for axis in (x, y, z)) + (e,)
            for name, (x, y, z, e) in trajectories.items()}


def state(app):
    return app.GetSceneName(), app.GetFrameCount(), app.TimelineGetFrameRate(), trajectories(app)


def write_c3d(path, labels, points, rate=100.0):
    """A C3D file made by the independent writer: points[frame][point] = (x, y, z)."""
    writer = c3d.Writer(point_rate=rate, analog_rate=0)
    for frame in points:
        block = np.zeros((len(labels), 5), np.float32)
        for i, p in enumerate(frame):
            block[i] = (*p, 0, 0)
        writer.add_frames([(block, np.zeros((0, 0), np.float32))])
    writer.set_point_labels(labels)
    with open(path, "wb") as handle:
        writer.write(handle)


def test_exported_c3d_is_read_by_an_independent_reader(app, tmp_path):
    app.TimelineSetFrameRate(120.0)
    lank = app.SceneGetObject("/Alice/LANK")[0]
    app.ChannelDeleteKey(lank, int(app.ObjectGetChannel(lank, "Z")[2]), 7)  # keyed in X and Y only: not seen
    path = tmp_path / "walk.c3d"
    app.ExportFile(str(path), "")
    written = independent(path, strict=True)
    expected = trajectories(app)
    assert (written.labels, written.rate, written.first_frame) == (list(expected), 120.0, 1)
    for column, (x, y, z, e) in enumerate(expected.values()):
        assert written.e[:, column].tolist() == e
        assert np.array_equal(written.xyz[:, column], np.float32(np.array([x, y, z]).T * np.array(e)[:, None]))


def test_a_take_longer_than_a_c3d_header_can_count(start_host, clients, tmp_path):
    app = clients(start_host("--scene", "empty", "--frames", "70000"))
    subject = app.SceneCreateObject("Subject", "S", app.SceneGetObject("/")[0], "")[0]
    app.SceneCreateObject("Marker", "M", subject, "")
    app.SetTrajectoryAtFrame("S", "M", 70000, 1.5, 2.5, 3.5, True)
    app.ExportFile(str(tmp_path / "long.c3d"), "c3d")
    written = independent(tmp_path / "long.c3d", strict=True)
    assert written.labels == ["S:M"] and len(written.e) == 70000
    assert written.xyz[-1, 0].tolist() == [1.5, 2.5, 3.5] and written.e[-2:, 0].tolist() == [False, True]


def test_merge_writes_the_file_into_the_scene(app, tmp_path):
    bob = trajectories(app)
    points = [[(f, 1, 2), (3, 4, f)] for f in range(50)]
    write_c3d(tmp_path / "more.c3d", ["Alice:LFHD", "Dave:NOSE"], points)
    app.ImportFile(str(tmp_path / "more.c3d"), "c3d", True)
    after = trajectories(app)
    assert after.pop("Alice:LFHD") == (list(range(50)), [1] * 50, [2] * 50, [True] * 50)
    assert after.pop("Dave:NOSE") == ([3] * 50, [4] * 50, list(range(50)), [True] * 50)
    del bob["Alice:LFHD"]
    assert after == bob
    assert app.GetSceneName() == ("Demo", "") and app.GetSubjectNames()[0] == ["Alice", "Bob", "Dave"]


def test_csv_export_has_one_row_per_frame_and_round_trips_exactly(app, start_host, clients, tmp_path):
    alice = app.SceneGetObject("/Alice")[0]
    app.ObjectSetAttributeValue(alice, "Name", 'Al, "the" walker')
    lank = app.SceneGetObject('/Al, "the" walker/LANK')[0]
    y = int(app.ObjectGetChannel(lank, "Y")[2])
    app.ChannelSetValue(lank, y, 5, 0, 0, "0.30000000000000004", "")
    app.ChannelDeleteKey(lank, y, 6)
    path = tmp_path / "walk.csv"
    app.ExportFile(str(path), "")
    with open(path, newline="") as handle:
        rows = list(csv.reader(handle))
    expected = trajectories(app)
    assert rows[0] == ["Frame"] + [f"{name}:{axis}" for name in expected for axis in "XYZ"]
    assert [row[0] for row in rows[1:]] == [str(f) for f in range(1, 51)]
    column = rows[0].index('Al, "the" walker:LANK:Y')
    assert rows[5][column] == "0.30000000000000004" and rows[6][column] == ""
    other = clients(start_host("--scene", "empty", "--frames", "3"))
    other.TimelineSetFrameRate(60.0)
    other.ImportFile(str(path), "CSV", False)
    assert seen(trajectories(other)) == seen(expected)
    assert other.GetFrameCount() == 50 and other.TimelineGetFrameRate() == 60.0


def test_csv_written_elsewhere_is_imported(app, tmp_path):
    path = tmp_path / "hand.csv"
    with open(path, "w", newline="") as handle:
        out = csv.writer(handle)  # CR LF line ends
        out.writerow(["Frame", "Eve:TIP:X", "Eve:TIP:Y", "Eve:TIP:Z"])
        out.writerows([[11 + f, f, "", 1e-3] for f in range(50)])
    app.ImportFile(str(path), "csv", True)
    x, y, z, e = app.GetTrajectory("Eve", "TIP")
    assert x == list(range(50)) and z == [1e-3] * 50 and e == [False] * 50
    tip = app.SceneGetObject("/Eve/TIP")[0]
    channel = int(app.ObjectGetChannel(tip, "X")[2])
    assert app.ChannelGetGaps(tip, channel, 0) == ""
    assert app.ChannelGetGaps(tip, int(app.ObjectGetChannel(tip, "Y")[2]), 0) == "1-50"


def c3d_header(file, **fields):
    """A C3D file with words of its header changed."""
    layout = {"key": (1, "B"), "points": (2, "<H"), "scale": (12, "<f"), "data": (16, "<H"), "rate": (20, "<f"),
              "parameters": (0, "B")}
    data = bytearray(file)
    for name, value in fields.items():
        offset, form = layout[name]
        struct.pack_into(form, data, offset, value)
    return bytes(data)


def c3d_parameter(data, name, value):
    """A C3D file with the value of the (first) parameter `name` changed."""
    at = data.index(name) + len(name) + 2  # past the offset word: type, dimensions, value
    at += 2 + data[at + 1]
    return data[:at] + value + data[at + len(value):]


def damaged_c3d(data):
    """A good C3D file broken in the ways a file can be: cut short, its header or parameters wrong."""
    parameters = data.index(b"POINT") - 6  # the parameter section's start
    labels = data.index(b"LABELS")
    yield from (data[:cut] for cut in (0, 100, 511, parameters + 40, len(data) // 2, len(data) - 300, len(data) - 600))
    yield c3d_header(data, key=0x51)
    yield c3d_header(data, parameters=0)
    yield c3d_header(data, parameters=200)
    yield c3d_header(data, data=60000)
    yield c3d_parameter(c3d_header(data, data=1), b"DATA_START", struct.pack("<H", 1))  # no start after the parameters
    yield c3d_parameter(c3d_header(data, rate=float("nan")), b"RATE", struct.pack("<f", -50))
    yield c3d_parameter(c3d_header(data, scale=0.0), b"SCALE", struct.pack("<f", float("inf")))
    yield data[:parameters + 3] + bytes([83]) + data[parameters + 4:]  # no processor type
    yield data[:labels + 2] + b"\x07" + data[labels + 3:]  # a name with a control character
    yield data[:labels + 6] + b"\x01\x00" + data[labels + 8:]  # an offset into the item itself
    yield data[:labels + 8] + b"\x03" + data[labels + 9:]  # an unknown type
    yield data[:labels + 10] + b"\xff" + data[labels + 11:]  # labels longer than their parameter
    yield c3d_parameter(data, b"ACTUAL_END_FIELD", struct.pack("<HH", 0xffff, 0x7fff))  # two thousand million frames


def damaged_csv(text):
    lines = text.split("\n")
    yield from (text[:cut] for cut in (0, 5, len(text) // 2, len(text) - 3))
    yield text.replace("Frame", "Time", 1)
    yield text.replace("LFHD:Y", "LFHD:Q", 1)
    yield text.replace("RFHD:X", "RFHX:X", 1)
    yield text.replace(":Z\n", ":Z,Extra\n", 1)
    yield "\n".join(lines[:3] + [lines[3] + ","] + lines[4:])
    for cell in ("1e999", "nan", "abc", "0x10"):
        row = lines[3].split(",")
        yield "\n".join(lines[:3] + [",".join(row[:2] + [cell] + row[3:])] + lines[4:])
    yield "\n".join(lines[:3] + lines[4:])  # a frame left out
    yield text.replace("Alice:LFHD:X", '"Alice:LFHD:X', 1)
    yield text.replace("Alice:LFHD:X", 'Alice:"LFHD":X', 1)
    yield text.replace("\n", "\r", 1)
    yield text.replace("Bob:C7", "Alice:C7")  # a point twice
    yield text.replace("Bob:C7", "Bob:", 1).replace("Bob:C7", "Bob:")
    yield lines[0] + "\n"  # no frames


@pytest.mark.parametrize("kind", ["c3d", "csv"])
def test_damaged_files_are_refused_and_the_scene_is_kept(app, tmp_path, kind):
    good = tmp_path / f"good.{kind}"
    app.ExportFile(str(good), "")
    app.SetTrajectoryAtFrame("Alice", "C7", 9, 1, 2, 3, True)
    before = state(app)
    bad = tmp_path / f"bad.{kind}"
    damaged = damaged_c3d(good.read_bytes()) if kind == "c3d" else (t.encode() for t in damaged_csv(good.read_text()))
    for number, data in enumerate(damaged):
        bad.write_bytes(data)
        for merge in (False, True):
            code, message = app.result("ImportFile", str(bad), "", merge)
            assert code == m.ApplicationError, (number, message)
            assert message.startswith(("the C3D file is damaged: ", "the CSV file is damaged at line ",
                                       "the point ")), (number, message)
    assert state(app) == before


def test_refusals_name_the_reason_and_keep_the_scene(app, tmp_path):
    write_c3d(tmp_path / "short.c3d", ["A:B"], [[(1, 2, 3)]] * 10)
    write_c3d(tmp_path / "fast.c3d", ["A:B"], [[(1, 2, 3)]] * 50, rate=2e6)
    app.ExportFile(str(tmp_path / "inches.c3d"), "")
    (tmp_path / "inches.c3d").write_bytes(c3d_parameter((tmp_path / "inches.c3d").read_bytes(), b"UNITS", b"in"))
    write_c3d(tmp_path / "camera.c3d", ["Camera1:B"], [[(1, 2, 3)]] * 50)
    before = state(app)
    cases = [
        ("ImportFile", str(tmp_path / "short.c3d"), "", True), "the file has 10 frames and the take 50: a merge needs the same number",
        ("ImportFile", str(tmp_path / "fast.c3d"), "", False), "the file's frame rate 2e+06 is not one the timeline supports",
        ("ImportFile", str(tmp_path / "inches.c3d"), "", False), "the C3D file's points are in 'in', not in mm, cm or m",
        ("ImportFile", str(tmp_path / "camera.c3d"), "", True), "the point 'Camera1:B' cannot be imported: 'Camera1' is a Camera",
        ("ImportFile", str(tmp_path / "none.c3d"), "", True), f"cannot read the file '{tmp_path / 'none.c3d'}'",
        ("ImportFile", str(tmp_path / "short.c3d"), "trc", True), f"no file format 'trc' (csv or c3d) for '{tmp_path / 'short.c3d'}'",
        ("ImportFile", str(tmp_path / "notes.txt"), "", True), f"no file format 'txt' (csv or c3d) for '{tmp_path / 'notes.txt'}'",
        ("ImportFile", "", "csv", True), "a file path cannot be empty",
        ("ExportFile", str(tmp_path / "no" / "x.csv"), ""), f"cannot write the file '{tmp_path / 'no' / 'x.csv'}'",
        ("ExportFile", str(tmp_path / "x"), ""), f"no file format '' (csv or c3d) for '{tmp_path / 'x'}'",
    ]
    for args, message in zip(cases[::2], cases[1::2]):
        assert app.result(*args) == (m.ApplicationError, message)
    assert state(app) == before
    assert not (tmp_path / "x").exists()


@pytest.mark.parametrize("marker, value, message", [
    ("a:b", "1", "the marker 'Alice/a:b' cannot be exported: a ':' in its name"),
    ("big", "1e300", "the marker 'Alice:big' holds 1e+300, too large for a C3D file"),
])
def test_markers_a_c3d_file_cannot_hold_are_refused(app, tmp_path, marker, value, message):
    created = app.SceneCreateObject("Marker", marker, app.SceneGetObject("/Alice")[0], "")[0]
    app.ChannelSetValue(created, int(app.ObjectGetChannel(created, "X")[2]), 1, 0, 0, value, "")
    for axis in "YZ":
        app.ChannelSetValue(created, int(app.ObjectGetChannel(created, axis)[2]), 1, 0, 0, "0", "")
    assert app.result("ExportFile", str(tmp_path / "x.c3d"), "") == (m.ApplicationError, message)
    assert not (tmp_path / "x.c3d").exists()
