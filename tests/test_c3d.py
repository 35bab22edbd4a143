"""Real C3D files through the application, against the independent reader (the `c3d` package): every
corpus file in data/c3d imported and exported again, markers in millimetres, analog channels
and the groups the application does not use; hand-made files for what the corpus lacks."""
import functools
import math
import re
import struct
from fractions import Fraction

import _Client3 as m
import numpy as np
import pytest

import hostproc
from hostproc import Client
from c3dfiles import CORPUS, analog_names, build, independent, point_names

DAMAGED = "sample_18_bad_parameter_section.c3d"
READABLE = [
    "sample_00_Codamotion_codamotion_gaitwands_19970212.c3d",
    "sample_00_Cometa_Systems_EMG_Data_Cometa.c3d",
    "sample_00_Innovative_Sports_Training_Gait_with_EMG.c3d",
    "sample_00_Motion_Analysis_Corporation_Walk1.c3d",
    "sample_01_Eb015pi.c3d", "sample_01_Eb015pr.c3d", "sample_01_Eb015si.c3d",
    "sample_01_Eb015sr.c3d", "sample_01_Eb015vi.c3d", "sample_01_Eb015vr.c3d",
    "sample_02_dec_real.c3d", "sample_02_sgi_int.c3d",
    "sample_07_16bitanalog.c3d", "sample_13_Dance.c3d", "sample_16_basketball.c3d",
    "sample_22_BKINtechnologies.c3d", "sample_30_admarche2.c3d", "sample_34_AlbertoINT.c3d",
]
TICKS_PER_SECOND = 705_600_000


@pytest.fixture(scope="module")
def host(tmp_path_factory):
    started = hostproc.start(log_path=tmp_path_factory.mktemp("c3d") / "host.log")
    yield started
    started.stop()


@pytest.fixture(scope="module")
def app(host):
    client = Client(host)
    yield client
    client.close()


@functools.lru_cache(maxsize=None)
def seen_in(name):
    return independent(CORPUS / name)


def import_take(app, path, merge=False):
    """Imports `path`; returns the (subject, marker) names the scene then holds."""
    app.ImportFile(str(path), "", merge)
    return {(s, mk) for s in app.GetSubjectNames()[0] for mk in app.GetMarkerNames(s)}


def trajectories(app, names):
    """X, Y, Z (frames x points x 3) and E of the named points."""
    tracks = [app.GetTrajectory(s, mk) for s, mk in names]
    xyz = np.array([t[:3] for t in tracks], dtype=float).transpose(2, 0, 1).reshape(-1, len(names), 3)
    e = np.array([t[3] for t in tracks], dtype=bool).T.reshape(-1, len(names))
    return xyz, e


def assert_points_match(xyz, e, seen):
    """E equal; coordinates within 1e-3 relative or 0.01 mm wherever a sample is seen."""
    assert np.array_equal(e, seen.e)
    assert np.allclose(xyz[e], seen.xyz[e], rtol=1e-3, atol=0.01)


def analog_objects(app):
    """(name, unit, rate, samples) of every Analog object, in the order of the tree."""
    out = []
    for object_id in app.SceneGetObjectList("Analog")[0]:
        value = lambda attribute: app.ObjectGetAttributeValue(object_id, attribute)[2]  # noqa: E731
        out.append((value("Name"), value("Unit"), float(value("Rate")), int(value("Samples"))))
    return out


@pytest.mark.parametrize("name", READABLE)
def test_a_take_is_imported_as_the_independent_reader_sees_it_and_exported_back_the_same(app, name, tmp_path):
    seen = seen_in(name)
    markers = import_take(app, CORPUS / name)
    names = point_names(seen.labels)
    assert markers == set(names)
    assert app.GetFrameCount() == len(seen.e)
    assert app.TimelineGetFrameRate() == np.float32(seen.rate)
    if names:
        assert_points_match(*trajectories(app, names), seen)
    frames, channels, per_frame = seen.analog.shape
    expected = analog_names(seen.analog_labels + [""] * (channels - len(seen.analog_labels)),
                            {"Take"} | {s for s, _ in names})
    units = seen.analog_units + [""] * (channels - len(seen.analog_units))
    got = analog_objects(app)
    assert [(n, u, s) for n, u, _, s in got] == [(n, u, frames * per_frame) for n, u in zip(expected, units)]
    assert all(math.isclose(rate, seen.analog_rate, rel_tol=1e-6) for _, _, rate, _ in got)

    app.ExportFile(str(tmp_path / "out.c3d"), "")
    written = independent(tmp_path / "out.c3d", strict=True)
    assert written.labels == [f"{s}:{mk}" for s, mk in names]
    assert np.float32(written.rate) == np.float32(seen.rate)
    assert_points_match(written.xyz, written.e, seen)
    assert written.analog_labels == expected
    assert written.analog.shape == seen.analog.shape
    assert np.allclose(written.analog, seen.analog, rtol=1e-6, atol=1e-9)
    assert written.groups == seen.groups


def test_repeated_labels_and_a_short_frame_count_are_logged(app, host):
    import_take(app, CORPUS / "sample_00_Motion_Analysis_Corporation_Walk1.c3d")
    import_take(app, CORPUS / "sample_13_Dance.c3d")
    log = host.log()
    assert "the label 'RKNE' is repeated: its point 26 is named 'Unlabeled:RKNE_2'" in log
    assert "the label 'VMID' is repeated: its point 43 is named 'Unlabeled:VMID_3'" in log
    assert "sample_13_Dance.c3d': it gives 500 frames and its data hold 499: 499 frames were read" in log


def test_the_parameters_hold_where_the_header_disagrees(app, host, tmp_path):
    data = bytearray(build(walk(4, 2), ["A:B", "A:C"], rate=50.0))
    struct.pack_into("<H", data, 2, 7)  # the header's point count
    struct.pack_into("<f", data, 20, 60.0)  # the header's frame rate
    (tmp_path / "disagree.c3d").write_bytes(data)
    assert import_take(app, tmp_path / "disagree.c3d") == {("A", "B"), ("A", "C")}
    assert app.TimelineGetFrameRate() == 50.0
    log = host.log()
    assert "disagree.c3d': its header gives 7 as its point count and its parameters 2: 2 was taken" in log
    assert "disagree.c3d': its header gives 60 as its frame rate and its parameters 50: 50 was taken" in log


def test_the_damaged_file_is_refused_in_printable_words(app):
    import_take(app, CORPUS / "sample_30_admarche2.c3d")
    before = (app.GetSceneName(), app.GetFrameCount(), analog_objects(app))
    for merge in (False, True):
        code, message = app.result("ImportFile", str(CORPUS / DAMAGED), "", merge)
        assert code == m.ApplicationError
        assert message.startswith("the C3D file is damaged: ") and message.isprintable() and message.isascii()
    assert (app.GetSceneName(), app.GetFrameCount(), analog_objects(app)) == before


def ticks_of(frame, rate):
    """The first whole tick at or after the exact start of `frame`."""
    return math.ceil(Fraction(frame - 1) * TICKS_PER_SECOND / Fraction(rate))


def test_a_rate_that_is_not_a_whole_number_is_kept_with_exact_ticks(app):
    name = "sample_13_Dance.c3d"
    import_take(app, CORPUS / name)
    rate = float(np.float32(seen_in(name).rate))
    assert app.TimelineGetFrameRate() == rate
    frames = app.GetFrameCount()
    for frame in (1, 2, frames // 2, frames):
        app.TimelineSetFrames(frame)
        assert app.TimelineGetTicks() == ticks_of(frame, rate)
        app.TimelineSetTicks(ticks_of(frame, rate) - (frame > 1))
        assert app.TimelineGetFrames() == frame - (frame > 1)
    assert app.result("TimelineSetTicks", ticks_of(frames + 1, rate))[0] == m.InvalidFrameNumber
    app.TimelineSetTicks(ticks_of(frames + 1, rate) - 1)
    assert app.TimelineGetFrames() == frames


@pytest.mark.parametrize("name", ["sample_07_16bitanalog.c3d", "sample_13_Dance.c3d"])
def test_analog_channels_and_the_rate_are_saved_with_the_scene(app, tmp_path, name):
    import_take(app, CORPUS / name)
    first = analog_objects(app), app.TimelineGetFrameRate()
    app.SaveFile(str(tmp_path / "take.scene"), "")
    app.NewScene()
    assert analog_objects(app) == []
    app.LoadFile(str(tmp_path / "take.scene"))
    assert (analog_objects(app), app.TimelineGetFrameRate()) == first
    app.ExportFile(str(tmp_path / "again.c3d"), "")
    written, original = independent(tmp_path / "again.c3d", strict=True), seen_in(name)
    assert np.allclose(written.analog, original.analog, rtol=1e-6, atol=1e-9)
    assert written.groups == original.groups


@pytest.mark.parametrize("damage, why", [
    (lambda text: text.replace("\nanalog 10 ", "\nanalog 0 ", 1), "a bad 'analog' line"),
    (lambda text: text.replace("\nsamples ", "\nsamples 1,", 1), "an analog channel without its samples for every frame"),
    (lambda text: "\n".join(line for line in text.split("\n") if not line.startswith("samples ")), "an analog channel without samples"),
    (lambda text: text.replace("object 2 0 Subject", "samples 1\nobject 2 0 Subject", 1), "samples out of place"),
    (lambda text: text.replace("\ngroupparameter ", "\ngroupparameter %00", 1), "a bad group parameter"),
    (lambda text: text.replace("\ngroup FORCE_PLATFORM ", "\ngroup point ", 1), "a bad group"),
    (lambda text: re.sub(r"\ngroup [^\n]*", "", text, count=1), "a group parameter out of place"),
])
def test_a_damaged_scene_file_with_analog_channels_is_refused(app, tmp_path, damage, why):
    import_take(app, CORPUS / "sample_07_16bitanalog.c3d")
    app.SaveFile(str(tmp_path / "good.scene"), "")
    (tmp_path / "bad.scene").write_text(damage((tmp_path / "good.scene").read_text()))
    code, message = app.result("LoadFile", str(tmp_path / "bad.scene"))
    assert code == m.ApplicationError and message.startswith("the scene file is damaged at line ") and message.endswith(why)


def test_a_removed_channel_is_not_written_and_takes_the_force_plates_with_it(app, tmp_path):
    name = "sample_01_Eb015pi.c3d"
    import_take(app, CORPUS / name)
    app.SceneRemoveObject(app.SceneGetObject("/FY1")[0], "")
    app.ExportFile(str(tmp_path / "fewer.c3d"), "")
    written, original = independent(tmp_path / "fewer.c3d", strict=True), seen_in(name)
    assert written.analog_labels == [label for label in original.analog_labels if label != "FY1"]
    assert np.array_equal(written.analog, np.delete(original.analog, 1, axis=1))
    assert written.groups == {group: items for group, items in original.groups.items() if group != "FORCE_PLATFORM"}


def test_scripts_rename_and_describe_analog_channels(app, tmp_path):
    import_take(app, CORPUS / "sample_30_admarche2.c3d")
    channel = app.SceneGetObject("/el-0")[0]
    app.ObjectSetAttributeValue(channel, "Name", "Left soleus")
    app.ObjectSetAttributeValue(channel, "Unit", "mV")
    assert app.result("ObjectSetAttributeValue", channel, "Scale", "2") == (
        m.ApplicationError, f"attribute 'Scale' of object {channel} is read-only")
    app.TimelineSetFrameRate(100.0)
    assert app.ObjectGetAttributeValue(channel, "Rate")[2] == "100"
    app.ExportFile(str(tmp_path / "renamed.c3d"), "")
    written = independent(tmp_path / "renamed.c3d", strict=True)
    assert (written.analog_labels[0], written.analog_units[0], written.analog_rate) == ("Left soleus", "mV", 100.0)


def test_analog_objects_cannot_be_made_by_scripts(app):
    root = app.SceneGetObject("/")[0]
    assert app.result("SceneCreateObject", "Analog", "EMG", root, "") == (
        m.ApplicationError, "an Analog object comes only with the analog channels of an imported C3D file")


# ---- Hand-made files ------------------------------------------------------------------------------

def walk(frames, count, seed=0):
    """Float samples frames x points x 4, every tenth one not seen (fourth word -1)."""
    rng = np.random.default_rng(seed)
    points = np.concatenate([rng.uniform(-2000, 2000, (frames, count, 3)), np.zeros((frames, count, 1))], axis=2)
    points[::10, ::3] = (0, 0, 0, -1)
    return points.astype(np.float32)


def test_many_points_in_centimetres_over_a_parameter_section_of_several_blocks(app, tmp_path):
    points = walk(5, 300)
    labels = [f"S{i // 100}:M{i % 100}" for i in range(300)]
    data = build(points, labels, units="Cm ")
    assert data[512 + 2] > 1  # the parameter section's blocks
    (tmp_path / "many.c3d").write_bytes(data)
    names = point_names(labels)
    assert import_take(app, tmp_path / "many.c3d") == set(names)
    xyz, e = trajectories(app, names)
    assert np.array_equal(e, points[:, :, 3] >= 0)
    assert np.allclose(xyz[e], points[:, :, :3][e].astype(float) * 10, rtol=1e-12)


def test_more_frames_than_a_header_can_count(app, tmp_path):
    raw = np.zeros((70_000, 1, 4), np.int16)
    raw[:, 0, 0] = np.arange(70_000) % 30_000
    raw[-1] = (7, 8, 9, -1)
    (tmp_path / "long.c3d").write_bytes(build(raw, ["P"], scale=0.5, units="m"))
    import_take(app, tmp_path / "long.c3d")
    assert app.GetFrameCount() == 70_000
    x, _, _, e = app.GetTrajectory("Unlabeled", "P")
    assert x[:-1] == [v * 500.0 for v in raw[:-1, 0, 0]] and e == [True] * 69_999 + [False]


def test_unsigned_analog_samples_and_offsets_are_written_back(app, tmp_path):
    raw = np.zeros((20, 1, 4), np.int16)
    raw[:, 0, :3] = (1, 2, 3)
    emg = (np.arange(20 * 2 * 2).reshape(20, 2, 2) * 1000 + 30_000) % 65_536  # many above 32767
    (tmp_path / "unsigned.c3d").write_bytes(build(raw, ["A:B"], scale=0.5, analog=emg, analog_per_frame=2, offsets=[40_000, 2048]))
    import_take(app, tmp_path / "unsigned.c3d")
    app.ExportFile(str(tmp_path / "out.c3d"), "")
    expected = emg.transpose(0, 2, 1) - np.array([40_000, 2048])[None, :, None]  # frames x channels x samples
    assert np.array_equal(independent(tmp_path / "unsigned.c3d").analog, expected)
    assert np.array_equal(independent(tmp_path / "out.c3d", strict=True).analog, expected)


def test_offsets_that_no_16_bit_integer_holds_are_written_back_as_floats(app, tmp_path):
    emg = np.arange(10 * 2, dtype=np.float32).reshape(10, 1, 2)
    (tmp_path / "offsets.c3d").write_bytes(build(np.zeros((10, 1, 4)), ["A:B"], analog=emg, offsets=[-5.0, 40_000.0]))
    import_take(app, tmp_path / "offsets.c3d")
    app.ExportFile(str(tmp_path / "out.c3d"), "")
    import_take(app, tmp_path / "out.c3d")
    offsets = [app.ObjectGetAttributeValue(analog, "Offset")[2] for analog in app.SceneGetObjectList("Analog")[0]]
    assert [float(offset) for offset in offsets] == [-5.0, 40_000.0]


def test_labels_become_names_an_object_can_have(app, tmp_path):
    labels = [b"\xc9paule", "Épaule".encode(), b"a/b:c\x01d", b""]  # Latin-1, UTF-8, bad characters, none
    (tmp_path / "labels.c3d").write_bytes(build(walk(3, 4), labels))
    assert import_take(app, tmp_path / "labels.c3d") == {
        ("Unlabeled", "Épaule"), ("Unlabeled", "Épaule_2"), ("a_b", "c_d"), ("Unlabeled", "Point4")}


def test_a_merge_replaces_analog_channels_only_when_the_file_brings_some(app, tmp_path):
    emg = np.arange(450 * 2 * 3, dtype=np.float32).reshape(450, 2, 3)
    (tmp_path / "emg.c3d").write_bytes(build(walk(450, 1), ["Eve:TIP"], rate=50.0, analog=emg, analog_per_frame=2))
    (tmp_path / "plain.c3d").write_bytes(build(walk(450, 1, seed=1), ["Eve:TOE"], rate=50.0))
    import_take(app, CORPUS / "sample_01_Eb015pr.c3d")
    plates = analog_objects(app)
    import_take(app, tmp_path / "plain.c3d", merge=True)
    assert analog_objects(app) == plates
    assert import_take(app, tmp_path / "emg.c3d", merge=True) >= {("Eve", "TIP"), ("Eve", "TOE")}
    assert analog_objects(app) == [("EMG1", "", 100.0, 900), ("EMG2", "", 100.0, 900), ("EMG3", "", 100.0, 900)]
