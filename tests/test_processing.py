"""Offline processing against real hosts: fix-occlusion on the demo take, checked against the smooth
motion that gaps were cut from, and its settings and refusals."""
import os
import re
import subprocess
import sys
import time

import numpy as np
import pytest
from scipy import interpolate

import _Client3 as m
from test_filters import runs
from test_settings import set_setting

RIGID = 1e-6  # mm: the demo's markers on one segment move together, so a neighbour's fill is exact

def trajectory(app, subject, marker):
    x, y, z, seen = app.GetTrajectory(subject, marker)
    return np.array([x, y, z]), np.array(seen)


def cut(app, subject, marker, first, length):
    """Hides frames [first, first + length) of a marker; returns its positions before."""
    values, seen = trajectory(app, subject, marker)
    hidden = seen.copy()
    hidden[first:first + length] = False
    app.SetTrajectory(subject, marker, *[list(v) for v in values], [bool(v) for v in hidden])
    return values


def distance(a, b):
    """Each frame's distance between two trajectories (3 x frames)."""
    return np.sqrt(((a - b) ** 2).sum(axis=0))


def first_slope(x):
    """The slope at the first of three frames, from all three (a second-order one-sided difference)."""
    return np.gradient(x, edge_order=2)[0]


def last_slope(x):
    return np.gradient(x, edge_order=2)[-1]


@pytest.mark.parametrize("hidden, before, after", [
    # frames hidden besides the gap [300, 320), and the slopes at frames 299 and 320
    ([], lambda x: last_slope(x[297:300]), lambda x: first_slope(x[320:323])),
    ([297, 322], lambda x: x[299] - x[298], lambda x: x[321] - x[320]),
    ([298, 321], lambda x: (x[320] - x[299]) / 21, lambda x: (x[320] - x[299]) / 21),
])
def test_a_cubic_fill_is_the_hermite_cubic_of_the_slopes_beside_the_gap(app, hidden, before, after):
    values, seen = trajectory(app, "Alice", "LKNE")
    mask = seen.copy()
    mask[300:320] = False
    mask[hidden] = False
    app.SetTrajectory("Alice", "LKNE", *[list(v) for v in values], [bool(v) for v in mask])
    app.OfflineFixOcclusion("Alice", "")
    filled = trajectory(app, "Alice", "LKNE")[0]
    for axis in range(3):
        x = values[axis]
        cubic = interpolate.CubicHermiteSpline([299, 320], [x[299], x[320]], [before(x), after(x)])
        assert filled[axis, 300:320] == pytest.approx(cubic(np.arange(300, 320)), abs=1e-9)


def test_gaps_up_to_the_transition_time_are_filled_and_longer_ones_stay_untouched(app):
    rigid = cut(app, "Alice", "LASI", 300, 50)  # RASI is on the pelvis too; 50 frames: the defaults' 0.5 s
    longer = cut(app, "Alice", "LFHD", 300, 51)
    app.OfflineFixOcclusion("Alice", "")
    filled, seen = trajectory(app, "Alice", "LASI")
    assert seen[300:350].all()
    assert distance(filled, rigid)[300:350].max() < RIGID
    left, seen = trajectory(app, "Alice", "LFHD")
    assert not seen[300:351].any()
    assert (left == longer).all()
    set_setting(app, "OcclusionFixing", "TransitionTime", 0.51)
    app.OfflineFixOcclusion("Alice", "")
    assert trajectory(app, "Alice", "LFHD")[1].all()


# ---- The pipeline: the order of the stages, their preconditions and their recorded results ----

CHAIN = [  # (operation, arguments) in an order that meets every precondition, for Alice
    ("OfflineCalibrateCameras", ("",)),
    ("OfflineReconstruct", ("",)),
    ("OfflineLabelROM", ("Alice", "")),
    ("OfflineCalibrateLabelingSubjects", ("Alice", "")),
    ("OfflineAutoLabel", ("Alice", "")),
    ("OfflineFixOcclusion", ("Alice", "")),
    ("OfflineCreateSolvingSetupFromLS", ("Alice",)),
    ("OfflineCalibrateSolvingSubjects", ("Alice", "")),
    ("OfflineSolve", ("Alice",)),
    ("OfflineRetarget", ("Alice",)),
]


def run_chain(app, stages):
    """Runs the first `stages` stages of CHAIN."""
    for operation, args in CHAIN[:stages]:
        getattr(app, operation)(*args)


def state(app):
    """The take's pipeline state: the active clip's Text parameters, by name."""
    clip = app.SceneGetObject("/Walk")[0]
    return {app.ParameterGet(clip, p, 2, "Name"): app.ParameterGet(clip, p, 2, "Value") for p in app.ObjectGetParameters(clip, 2)}


def seen_frames(app, subject):
    return np.array([trajectory(app, subject, marker)[1] for marker in app.GetMarkerNames(subject)])


# ---- What each stage says it did: the success record's text, its numbers counted from the scene ----

def bones_of_markers(app, subject):
    """Each marker's bone, from the subject's constraints."""
    return {app.GetConstraintDetails(subject, "", c)[1]: app.GetConstraintDetails(subject, "", c)[2]
            for c in app.GetConstraintNames(subject, "")}


def count(n, noun):
    return f"{n} {noun}" + ("" if n == 1 else "s")


def fix_summary(app, subject, longest=50):
    """What occlusion fixing will say for `subject`, from the gaps of its markers now: a gap is filled
    rigidly when a marker of the same bone is seen across it and beside it."""
    seen = {marker: trajectory(app, subject, marker)[1] for marker in app.GetMarkerNames(subject)}
    bone = bones_of_markers(app, subject)
    filled = rigid = longer = ends = 0
    for marker, mask in seen.items():
        for first, end in runs(~mask):
            if first == 0 or end == len(mask):
                ends += 1
            elif end - first > longest:
                longer += 1
            else:
                filled += 1
                rigid += any(bone[other] == bone[marker] and seen[other][first - 1:end + 1].all()
                             for other in seen if other != marker)
    return (f"{subject}: {count(filled, 'gap')} filled ({rigid} from a marker of the same segment, {filled - rigid} by cubic "
            f"interpolation), {longer + ends} left ({longer} longer than {count(longest, 'frame')}, {ends} at an end of the take)")


def test_occlusion_fixing_says_what_it_filled_and_left_and_without_apply_fixed_markers_leaves_fills_unseen(app):
    cut(app, "Bob", "RKNE", 0, 3)  # a gap at the take's start stays
    expected = "; ".join(fix_summary(app, subject) for subject in ("Alice", "Bob"))
    assert app.result("OfflineFixOcclusion", "", "") == (m.Success, expected)
    set_setting(app, "OcclusionFixing", "ApplyFixedMarkers", False)
    truth, seen = trajectory(app, "Bob", "RFHD")
    seen[500:530] = False
    zeroed = truth.copy()
    zeroed[:, 500:530] = 0  # the fill is written over these all the same
    app.SetTrajectory("Bob", "RFHD", *[list(v) for v in zeroed], [bool(v) for v in seen])
    assert app.result("OfflineFixOcclusion", "Bob", "") == (
        m.Success, fix_summary(app, "Bob") + "; the filled frames stay unseen (ApplyFixedMarkers is off)")
    after, still_seen = trajectory(app, "Bob", "RFHD")
    assert not still_seen[500:530].any()
    assert np.abs(after - truth)[:, 500:530].max() < RIGID


def placed_frames(app, subject):
    """Frames where the solver places every bone: each bone tied to markers has one of them seen (the
    bones without markers follow a parent that has them)."""
    bone = bones_of_markers(app, subject)
    seen = {marker: trajectory(app, subject, marker)[1] for marker in bone}
    return int(np.all([np.any([seen[marker] for marker in bone if bone[marker] == b], axis=0)
                       for b in set(bone.values())], axis=0).sum())


def translations(app, subject):
    bones = [i for i, kind in zip(*app.ObjectGetDescendants(app.SceneGetObject(f"/{subject}")[0])) if kind == "Bone"]
    return [app.ObjectGetAttributeValue(bone, "Translation")[2] for bone in bones]


# What each stage records in the take's pipeline state, by stage: its results, then its settings.
RECORDED = {
    "OfflineCalibrateCameras": "cameras=4;Enabled=true,",
    "OfflineReconstruct": "trajectories=24,seen={everyone};EnvironmentalDriftTolerance=1.5,",
    "OfflineLabelROM": "markers=12,frames=867;StandardDeviation=2,",
    "OfflineCalibrateLabelingSubjects": "constraints=12,frames=200;RestImportance=1,",
    "OfflineAutoLabel": "labelled={alice},moved=0,dropped=0;UseLabelingClusters=true,",
    "OfflineFixOcclusion": "filled=3,rigid=1,left=1;Enabled=true,",
    "OfflineCreateSolvingSetupFromLS": "bones=13,constraints=12",
    "OfflineCalibrateSolvingSubjects": "bones=13,calibrated=4;PriorImportance=1,",
    "OfflineSolve": "bones=13,frames=920;PriorImportance=1,",
    "OfflineRetarget": "bones=13,scale=1.0416666666666667",
}


def test_each_stage_says_and_records_what_it_did(app):
    cameras = len(app.SceneGetObjectList("Camera")[0])
    everyone = sum(int(seen_frames(app, s).sum()) for s in ("Alice", "Bob"))
    alice = int(seen_frames(app, "Alice").sum())
    active = m.Output_LabelingSubjectCalibrationSettings_ActiveFrames_get(
        app.record("OfflineGetLabelingSubjectCalibrationSettings"))
    height = app.GetSubjectParamDetails("Alice", "", "Height")[0]
    bones = len(app.GetBoneNames("Alice", ""))
    # Each stage's text, worked out from the scene as it is just before the stage runs.
    expected = {
        "OfflineCalibrateCameras": lambda: f"{cameras} cameras counted; the take has no camera data, so nothing was calibrated",
        "OfflineReconstruct": lambda: (f"24 trajectories counted, seen at {everyone} frames in all; the take has no camera data, "
                                       "so nothing was reconstructed"),
        "OfflineLabelROM": lambda: f"Alice: label template of 12 markers made from {seen_frames(app, 'Alice').all(axis=0).sum()} frames",
        "OfflineCalibrateLabelingSubjects": lambda: (
            f"Alice: offsets of 12 constraints set from {min(active, seen_frames(app, 'Alice').all(axis=0).sum())} frames"),
        "OfflineAutoLabel": lambda: (f"Alice: {seen_frames(app, 'Alice').sum()} labels given, 0 of them to a point another "
                                     "marker held; 0 points dropped"),
        "OfflineFixOcclusion": lambda: fix_summary(app, "Alice"),
        "OfflineCreateSolvingSetupFromLS": lambda: f"Alice: {bones} bones and 12 constraints checked",
        "OfflineCalibrateSolvingSubjects": None,  # counted after: the translations it changed
        "OfflineSolve": lambda: (f"Alice: {bones} bones solved into TX, TY and TZ, every one of them placed at "
                                 f"{placed_frames(app, 'Alice')} of 1000 frames"),
        "OfflineRetarget": lambda: (f"Alice: {bones} bones retargeted into RX, RY and RZ, their offsets from the root scaled by "
                                    f"{1750 / height!r} to the 1750 mm figure"),
    }
    for number, (operation, args) in enumerate(CHAIN, start=1):
        before = expected[operation]() if expected[operation] else translations(app, "Alice")
        code, text = app.result(operation, *args)
        if not expected[operation]:
            changed = sum(a != b for a, b in zip(before, translations(app, "Alice")))
            before = f"Alice: translations of {changed} of {bones} bones set"
        assert (code, text) == (m.Success, before), operation
        recorded = state(app)
        assert len(recorded) == number
        key = "Pipeline " + operation + (" Alice" if args[0] == "Alice" else "")
        assert recorded[key].startswith(RECORDED[operation].format(everyone=everyone, alice=alice)), operation


NEEDS = [  # (how many stages of CHAIN ran before, operation, arguments, the refusal)
    (0, "OfflineReconstruct", ("",), "'OfflineReconstruct' needs 'OfflineCalibrateCameras' to run first"),
    (1, "OfflineLabelROM", ("Alice", ""), "'OfflineLabelROM' needs 'OfflineReconstruct' to run first"),
    (2, "OfflineCalibrateLabelingSubjects", ("Alice", ""), "needs 'OfflineLabelROM' to run first for subject 'Alice'"),
    (3, "OfflineAutoLabel", ("Alice", ""), "needs 'OfflineCalibrateLabelingSubjects' to run first for subject 'Alice'"),
    (3, "OfflineCreateSolvingSetupFromLS", ("Alice",), "needs 'OfflineCalibrateLabelingSubjects' to run first for subject 'Alice'"),
    (6, "OfflineCalibrateSolvingSubjects", ("Alice", ""), "needs 'OfflineCreateSolvingSetupFromLS' to run first for subject 'Alice'"),
    (7, "OfflineSolve", ("Alice",), "needs 'OfflineCalibrateSolvingSubjects' to run first for subject 'Alice'"),
    (8, "OfflineRetarget", ("Alice",), "needs 'OfflineSolve' to run first for subject 'Alice'"),
    (9, "OfflineSolve", ("",), "needs 'OfflineCalibrateSolvingSubjects' to run first for subject 'Bob'"),
    (0, "OfflineLabelROM", ("Carol", ""), "no subject named 'Carol'"),
    (0, "OfflineReconstruct", ("fast",), "'OfflineReconstruct' takes no options: 'fast'"),
]


@pytest.mark.parametrize("ran, operation, args, message", NEEDS)
def test_a_stage_whose_need_has_not_run_is_refused_and_changes_nothing(app, tmp_path, ran, operation, args, message):
    run_chain(app, ran)
    before = app.scene_file(tmp_path / "scene")
    assert message in app.result(operation, *args)[1]
    assert app.scene_file(tmp_path / "scene") == before


def test_quick_post_runs_its_stages_in_order_until_one_cannot_run(app):
    assert app.result("OfflineQuickPost", "Alice", "")[1] == (
        "quick post stopped at 'OfflineAutoLabel': 'OfflineAutoLabel' needs 'OfflineReconstruct' to run first")
    assert state(app) == {}
    run_chain(app, 4)
    assert app.result("OfflineQuickPost", "Alice", "")[1] == (
        "quick post stopped at 'OfflineSolve': 'OfflineSolve' needs 'OfflineCalibrateSolvingSubjects' to run first for subject 'Alice'")
    assert {"Pipeline OfflineAutoLabel Alice", "Pipeline OfflineFixOcclusion Alice"} <= set(state(app))
    assert "Pipeline OfflineSolve Alice" not in state(app)
    for operation, args in CHAIN[6:8]:
        getattr(app, operation)(*args)
    code, text = app.result("OfflineQuickPost", "Alice", "")
    assert code == m.Success
    # Each stage's own text is checked above: here, that they come in order, each named with its subject.
    assert re.fullmatch(r"OfflineAutoLabel Alice: .+; OfflineFixOcclusion Alice: .+; OfflineSolve Alice: .+", text), text


# ---- What the stages compute: templates, labels, offsets, bone paths ----

def template(app, subject, marker):
    """A marker's label template: its offset from the subject's centroid and its reach."""
    obj = app.SceneGetObject(f"/{subject}/{marker}")[0]
    value = app.ParameterGet(obj, app.ObjectGetParameter(obj, 2, "Template"), 2, "Value")
    x, y, z, reach = map(float, value.split(","))
    return np.array([x, y, z]), reach


def test_rom_labelling_places_each_template_where_the_marker_sits_relative_to_the_others(app):
    head, truth = trajectory(app, "Alice", "LFHD"), trajectory(app, "Alice", "RFHD")
    run_chain(app, 3)
    apart = template(app, "Alice", "LFHD")[0] - template(app, "Alice", "RFHD")[0]
    assert np.abs(apart - (head[0] - truth[0])[:, 0]).max() < 1e-6  # the head moves rigidly
    assert template(app, "Alice", "LFHD")[1] == 30  # SeparationDistance: the head barely swings
    assert template(app, "Alice", "LANK")[1] > 300  # StandardDeviation x the ankle's wide swing


def swap(app, subject, one, other):
    a, b = app.GetTrajectory(subject, one), app.GetTrajectory(subject, other)
    app.SetTrajectory(subject, one, *b)
    app.SetTrajectory(subject, other, *a)


def move_to_new_marker(app, subject, marker, new):
    """Moves a marker's trajectory to a new marker of the subject, which has no label template."""
    app.SceneCreateObject("Marker", new, app.SceneGetObject(f"/{subject}")[0], "")
    data = app.GetTrajectory(subject, marker)
    app.SetTrajectory(subject, new, *data)
    app.SetTrajectory(subject, marker, *data[:3], [False] * len(data[3]))


@pytest.mark.parametrize("scramble, moved", [
    (lambda app: swap(app, "Alice", "LANK", "RANK"), 1965),   # both ankles, each seen but in its gap
    (lambda app: move_to_new_marker(app, "Alice", "LKNE", "U1"), 1000),
])
def test_automatic_labelling_gives_each_trajectory_back_its_label(app, scramble, moved):
    before = {marker: trajectory(app, "Alice", marker) for marker in app.GetMarkerNames("Alice")}
    run_chain(app, 4)
    scramble(app)
    app.OfflineAutoLabel("Alice", "")
    for marker, (values, seen) in before.items():
        after, now = trajectory(app, "Alice", marker)
        assert (now == seen).all(), marker
        assert (after[:, seen] == values[:, seen]).all(), marker
    assert f"moved={moved},dropped=0;" in state(app)["Pipeline OfflineAutoLabel Alice"]


@pytest.mark.parametrize("constraint, markers", [
    ("LFHD_Head", ("LFHD", "RFHD")),   # half the way from one head marker to the other
    ("LWRA_LeftHand", ("LWRA",)),      # alone on its bone: no offset
])
def test_subject_calibration_offsets_each_marker_from_the_centre_of_its_bone(app, constraint, markers):
    run_chain(app, 4)
    positions = [trajectory(app, "Alice", marker)[0][:, 0] for marker in markers]
    offset = app.GetConstraintDetails("Alice", "", constraint)[3]
    assert np.abs(np.array(offset) - (positions[0] - np.mean(positions, axis=0))).max() < 1e-3


def bone_path(app, subject, bone_path_, prefix, frames):
    """A bone's positions (3 x len(frames)) and keys in its channels PREFIX X, Y and Z."""
    bone = app.SceneGetObject(f"/{subject}/{bone_path_}")[0]
    channels = [int(app.ObjectGetChannel(bone, prefix + axis)[2]) for axis in "XYZ"]
    values = np.array([[float(app.ChannelGetValue(bone, c, f, 0, 0, "")[2]) for f in frames] for c in channels])
    keys = np.array([app.ChannelHasKey(bone, channels[0], f) == "true" for f in frames])
    return values, keys


FRAMES = [1, 130, 420, 860, 1000]  # in and out of Alice's gaps


def test_solving_places_each_bone_from_its_markers_or_else_its_parent(app):
    run_chain(app, 9)
    lasi, rasi = trajectory(app, "Alice", "LASI")[0], trajectory(app, "Alice", "RASI")[0]
    pelvis, keyed = bone_path(app, "Alice", "Pelvis", "T", FRAMES)
    centre = (lasi + rasi)[:, [f - 1 for f in FRAMES]] / 2
    assert keyed.all()
    assert np.abs(pelvis - centre).max() < 1e-3
    # The thigh has no markers: it follows the pelvis at its rest translation.
    thigh = bone_path(app, "Alice", "Pelvis/LeftThigh", "T", FRAMES)[0]
    rest = app.ObjectGetAttributeValue(app.SceneGetObject("/Alice/Pelvis/LeftThigh")[0], "Translation")[2]
    assert np.abs(thigh - pelvis - np.array([float(v) for v in rest.split(",")])[:, None]).max() < 1e-9
    hand = bone_path(app, "Alice", "Pelvis/Thorax/RightArm/RightHand", "T", FRAMES)[1]
    assert hand.tolist() == [True, True, True, False, True]  # RWRA's 0.8 s gap stays after fixing: no key there


def test_solving_subject_calibration_sets_a_bone_translation_from_its_parent(app):
    run_chain(app, 8)
    head = app.ObjectGetAttributeValue(app.SceneGetObject("/Alice/Pelvis/Thorax/Head")[0], "Translation")[2]
    heads = [trajectory(app, "Alice", marker)[0][:, 0] for marker in ("LFHD", "RFHD")]
    thorax = [trajectory(app, "Alice", marker)[0][:, 0] for marker in ("C7", "STRN")]
    expected = np.mean(heads, axis=0) - np.mean(thorax, axis=0)
    assert np.abs(np.array([float(v) for v in head.split(",")]) - expected).max() < 1e-6


def test_retargeting_scales_each_bone_offset_from_the_root_to_the_standard_height(app):
    run_chain(app, 10)
    pelvis = bone_path(app, "Alice", "Pelvis", "T", FRAMES)[0]
    head = bone_path(app, "Alice", "Pelvis/Thorax/Head", "T", FRAMES)[0]
    retargeted = bone_path(app, "Alice", "Pelvis/Thorax/Head", "R", FRAMES)[0]
    assert np.abs(retargeted - (pelvis + (head - pelvis) * 1750 / 1680)).max() < 1e-6


def hide_marker(app, subject="Alice"):
    x, y, z, seen = app.GetTrajectory(subject, "C7")
    app.SetTrajectory(subject, "C7", x, y, z, [False] * len(seen))


def break_constraint(app):
    app.ObjectSetAttributeValue(app.SceneGetObject("/Alice/STRN_Thorax")[0], "Source", "NOPE")


def zero_height(app):
    alice = app.SceneGetObject("/Alice")[0]
    app.ParameterSet(alice, app.ObjectGetParameter(alice, 1, "Height"), 1, "Value", "0")


@pytest.mark.parametrize("ran, spoil, operation, args, message", [
    (2, hide_marker, "OfflineLabelROM", ("Alice", ""), "no frame of the take sees every marker of subject 'Alice'"),
    (2, lambda app: hide_marker(app, "Bob"), "OfflineLabelROM", ("", ""),  # Alice, labelled first, is not written either
     "no frame of the take sees every marker of subject 'Bob'"),
    (4, break_constraint, "OfflineCreateSolvingSetupFromLS", ("Alice",),
     "constraint 'STRN_Thorax' of subject 'Alice' ties marker 'NOPE', which the subject does not have"),
    (9, zero_height, "OfflineRetarget", ("Alice",), "subject 'Alice' has no positive Height parameter to retarget from"),
    (2, lambda app: set_setting(app, "LabelROM", "SeparationDistance", 200), "OfflineLabelROM", ("Alice", ""),
     "markers 'LFHD' and 'RFHD' of subject 'Alice' lie closer together than the LabelROM setting 'SeparationDistance' (200 mm)"),
    (0, lambda app: set_setting(app, "OcclusionFixing", "Enabled", False), "OfflineFixOcclusion", ("Alice", ""),
     "occlusion fixing is off (OcclusionFixing setting 'Enabled')"),
    (0, lambda app: app.NewScene(), "OfflineCalibrateCameras", ("",),
     "'OfflineCalibrateCameras' needs at least two cameras in the scene, and there are 0"),
])
def test_a_stage_the_scene_or_its_settings_forbid_is_refused_and_changes_nothing(app, tmp_path, ran, spoil, operation, args, message):
    run_chain(app, ran)
    spoil(app)
    before = app.scene_file(tmp_path / "scene")
    assert app.result(operation, *args)[1] == message
    assert app.scene_file(tmp_path / "scene") == before


# ---- Long stages: progress in the log, and other clients served meanwhile ----

STAGE_IN_CHILD = """
import sys
sys.path[:0] = [sys.argv[1]]
import companion
from hostproc import Client
companion.register()

class Host:
    address, port = "127.0.0.1", int(sys.argv[2])

Client(Host).OfflineFixOcclusion("", "")
"""


def test_reads_are_answered_and_writes_wait_while_another_client_runs_a_long_stage(start_host, clients):
    host = start_host("--frames", "20000", "--fault", "stage-delay=40")
    reader = clients(host)
    stage = subprocess.Popen([sys.executable, "-c", STAGE_IN_CHILD, os.path.dirname(__file__), str(host.port)])
    try:
        answered = 0
        deadline = time.monotonic() + 60  # the child's start-up may be slow on a busy machine
        while time.monotonic() < deadline:
            if "Pipeline OfflineFixOcclusion" in host.log() or stage.poll() is not None:
                break
            started = "OfflineFixOcclusion subject 'Alice': 10% done" in host.log()
            reader.GetTrajectoryAtFrame("Alice", "LANK", 1)
            if started and "Pipeline OfflineFixOcclusion" not in host.log():
                answered += 1
                reader.SetSceneName("Renamed")  # a write waits for the stage to finish
                assert "Pipeline OfflineFixOcclusion Bob" in host.log()
                break
        assert answered == 1
        assert stage.wait(timeout=60) == 0
    finally:
        stage.kill()
        stage.wait()
    log = host.log()
    assert "OfflineFixOcclusion subject 'Bob': 100% done" in log
    assert log.index("OfflineFixOcclusion subject 'Alice': 50% done") < log.index("Pipeline OfflineFixOcclusion Alice")
