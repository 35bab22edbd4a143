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
