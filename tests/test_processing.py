"""Offline processing against real hosts: fix-occlusion on the demo take, checked against the smooth
motion that gaps were cut from, and its settings and refusals."""
import numpy as np
import pytest

import _Client3 as m
from appclient import Client

RIGID = 1e-6  # mm: the demo's markers on one segment move together, so a neighbour's fill is exact
CUBIC = 1.0  # mm: cubic fill of gaps up to 0.2 s


@pytest.fixture
def app(start_host):
    client = Client(start_host("--frames", "1000"))
    yield client
    client.close()


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


def set_occlusion(app, field, value):
    settings = app.record("OfflineGetOcclusionFixingSettings")
    getattr(m, f"Output_OcclusionFixingSettings_{field}_set")(settings, value)
    app.OfflineSetOcclusionFixingSettings(settings)


def unseen(app, subject):
    return {marker: int((~trajectory(app, subject, marker)[1]).sum()) for marker in app.GetMarkerNames(subject)}


@pytest.mark.parametrize("marker, length, tolerance", [
    ("LFHD", 40, RIGID),   # RFHD is on the head too
    ("LASI", 50, RIGID),   # the longest gap the defaults fill
    ("LKNE", 5, CUBIC),    # alone on its segment
    ("LKNE", 20, CUBIC),
    ("LANK", 10, CUBIC),
    ("RWRA", 15, CUBIC),
])
def test_a_cut_gap_is_filled_close_to_the_motion_it_was_cut_from(app, marker, length, tolerance):
    truth = cut(app, "Alice", marker, 300, length)
    app.OfflineFixOcclusion("Alice", "")
    filled, seen = trajectory(app, "Alice", marker)
    assert seen[300:300 + length].all()
    assert np.abs(filled - truth)[:, 300:300 + length].max() < tolerance


def test_longer_gaps_than_the_transition_time_stay_and_the_rest_are_untouched(app):
    truth = cut(app, "Alice", "LFHD", 300, 51)
    app.OfflineFixOcclusion("Alice", "")
    after, seen = trajectory(app, "Alice", "LFHD")
    assert not seen[300:351].any()
    assert (after == truth).all()
    set_occlusion(app, "TransitionTime", 0.51)
    app.OfflineFixOcclusion("Alice", "")
    assert trajectory(app, "Alice", "LFHD")[1].all()


def test_the_demo_gaps_of_every_subject_are_filled_up_to_the_longest_allowed(app):
    assert unseen(app, "Alice")["RWRA"] == 80
    app.OfflineFixOcclusion("", "")
    assert unseen(app, "Alice") == {marker: 80 if marker == "RWRA" else 0 for marker in app.GetMarkerNames("Alice")}
    assert set(unseen(app, "Bob").values()) == {0}


def test_only_the_named_subject_is_filled(app):
    bob = unseen(app, "Bob")
    app.OfflineFixOcclusion("Alice", "")
    assert unseen(app, "Bob") == bob


def test_without_apply_fixed_markers_the_values_are_written_and_the_frames_stay_unseen(app):
    set_occlusion(app, "ApplyFixedMarkers", False)
    truth = cut(app, "Bob", "RFHD", 500, 30)
    zeroed = truth.copy()
    zeroed[:, 500:530] = 0
    app.SetTrajectory("Bob", "RFHD", *[list(v) for v in zeroed], [not 500 <= f < 530 for f in range(1000)])
    app.OfflineFixOcclusion("Bob", "")
    after, seen = trajectory(app, "Bob", "RFHD")
    assert not seen[500:530].any()
    assert np.abs(after - truth)[:, 500:530].max() < RIGID


@pytest.mark.parametrize("subject, options, setting, message", [
    ("Carol", "", None, "no subject named 'Carol'"),
    ("Alice", "fast", None, "takes no options"),
    ("Alice", "", ("Enabled", False), "occlusion fixing is off (OcclusionFixing setting 'Enabled')"),
])
def test_a_refused_fix_changes_nothing(app, tmp_path, subject, options, setting, message):
    if setting:
        set_occlusion(app, *setting)
    app.SaveFile(str(tmp_path / "before.scene"), "")
    assert message in app.refusal("OfflineFixOcclusion", subject, options)[1]
    app.SaveFile(str(tmp_path / "after.scene"), "")
    assert (tmp_path / "after.scene").read_bytes() == (tmp_path / "before.scene").read_bytes()


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


def state(app):
    """The take's pipeline state: the active clip's Text parameters, by name."""
    clip = app.SceneGetObject("/Walk")[0]
    return {app.ParameterGet(clip, p, 2, "Name"): app.ParameterGet(clip, p, 2, "Value") for p in app.ObjectGetParameters(clip, 2)}


def seen_frames(app, subject):
    return np.array([trajectory(app, subject, marker)[1] for marker in app.GetMarkerNames(subject)])


def test_the_stages_record_their_documented_results_in_order(app):
    seen = sum(int(seen_frames(app, s).sum()) for s in ("Alice", "Bob"))
    expected = {
        "OfflineCalibrateCameras": "cameras=4;Enabled=true,",
        "OfflineReconstruct": f"trajectories=24,seen={seen};EnvironmentalDriftTolerance=1.5,",
        "OfflineLabelROM Alice": "markers=12,labelled=12;StandardDeviation=2,",
        "OfflineCalibrateLabelingSubjects Alice": "markers=12,labelled=12;RestImportance=1,",
        "OfflineAutoLabel Alice": "markers=12,labelled=12;UseLabelingClusters=true,",
        "OfflineFixOcclusion Alice": "filled=3,rigid=1,left=1;Enabled=true,",
        "OfflineCreateSolvingSetupFromLS Alice": "bones=13,constraints=12",
        "OfflineCalibrateSolvingSubjects Alice": "bones=13,constraints=12;PriorImportance=1,",
        "OfflineSolve Alice": "frames=920;PriorImportance=1,",
        "OfflineRetarget Alice": "frames=920",
    }
    for number, (operation, args) in enumerate(CHAIN):
        getattr(app, operation)(*args)
        recorded = state(app)
        assert len(recorded) == number + 1
        key = "Pipeline " + operation + (" Alice" if args[0] == "Alice" else "")
        assert recorded[key].startswith(expected[key[len("Pipeline "):]])
    assert seen_frames(app, "Alice").all(axis=0).sum() == 920


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
    for earlier, earlier_args in CHAIN[:ran]:
        getattr(app, earlier)(*earlier_args)
    app.SaveFile(str(tmp_path / "before.scene"), "")
    assert message in app.refusal(operation, *args)[1]
    app.SaveFile(str(tmp_path / "after.scene"), "")
    assert (tmp_path / "after.scene").read_bytes() == (tmp_path / "before.scene").read_bytes()


def test_camera_calibration_needs_two_cameras(app):
    app.NewScene()
    assert "needs at least two cameras in the scene, and there are 0" in app.refusal("OfflineCalibrateCameras", "")[1]


def test_quick_post_runs_its_stages_in_order_and_stops_at_the_first_that_cannot_run(app):
    assert app.refusal("OfflineQuickPost", "Alice", "")[1] == (
        "quick post stopped at 'OfflineAutoLabel': 'OfflineAutoLabel' needs 'OfflineReconstruct' to run first")
    assert state(app) == {}
    for operation, args in CHAIN[:4]:
        getattr(app, operation)(*args)
    assert app.refusal("OfflineQuickPost", "Alice", "")[1] == (
        "quick post stopped at 'OfflineSolve': 'OfflineSolve' needs 'OfflineCalibrateSolvingSubjects' to run first for subject 'Alice'")
    assert {"Pipeline OfflineAutoLabel Alice", "Pipeline OfflineFixOcclusion Alice"} <= set(state(app))
    assert "Pipeline OfflineSolve Alice" not in state(app)
    for operation, args in CHAIN[6:8]:
        getattr(app, operation)(*args)
    app.OfflineQuickPost("Alice", "")
    assert state(app)["Pipeline OfflineSolve Alice"].startswith("frames=920;")


def test_a_stage_records_the_settings_it_ran_with(app):
    for operation, args in CHAIN[:8]:
        getattr(app, operation)(*args)
    settings = app.record("OfflineGetSolvingSettings")
    m.Output_SolvingSettings_PriorImportance_set(settings, 5.5)
    app.OfflineSetSolvingSettings(settings)
    app.OfflineSolve("Alice")
    assert "PriorImportance=5.5," in state(app)["Pipeline OfflineSolve Alice"]
    assert "PriorImportance=1," in state(app)["Pipeline OfflineCalibrateSolvingSubjects Alice"]
