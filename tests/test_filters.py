"""The two channel filters against real hosts, checked against the same kernels applied with
NumPy/SciPy: gaps stay gaps and never reach their neighbours, and bad constants change nothing."""
import numpy as np
import pytest
from scipy import signal

FRAMES = 300
MARKER = ("Alice", "RANK")  # a marker with a gap in the demo take


@pytest.fixture
def frames():
    return FRAMES


def marker(app):
    obj = app.SceneGetObject("/" + "/".join(MARKER))[0]
    return obj, {axis: int(app.ObjectGetChannel(obj, axis)[2]) for axis in "XYZ"}


def trajectory(app):
    x, y, z, seen = app.GetTrajectory(*MARKER)
    return np.array([x, y, z]), np.array(seen)


def runs(mask):
    """(first, end) of every stretch of True."""
    edges = np.flatnonzero(np.diff(np.concatenate([[0], mask.astype(int), [0]])))
    return list(zip(edges[::2], edges[1::2]))


def filtered(values, mask, kernel):
    """The kernel applied to each stretch of `mask` on its own, each extended by its odd reflection."""
    out = values.copy()
    half = len(kernel) // 2
    for first, end in runs(mask):
        part = values[first:end]
        if len(part) <= half:
            continue
        left = 2 * part[0] - part[1:half + 1][::-1]
        right = 2 * part[-1] - part[-half - 1:-1][::-1]
        out[first:end] = signal.convolve(np.concatenate([left, part, right]), kernel, mode="valid", method="direct")
    return out


def fir(taps, cutoff, rate, transition):
    return signal.firwin(taps, cutoff + transition / 2, window="hamming", fs=rate)


# The constants, and the channel named with component XYZ (any of the three stands for all three).
@pytest.mark.parametrize("taps, cutoff, rate, transition, named", [
    (1, 10, 100, 0, "X"), (21, 6, 100, 4, "Z"), (31, 1.5, 0, 2, "X"), (299, 8, 100, 1, "Y"),
])
def test_fir_matches_the_same_coefficients_applied_with_scipy(app, taps, cutoff, rate, transition, named):
    obj, channels = marker(app)
    before, seen = trajectory(app)
    app.FilterApplyFIR(obj, channels[named], "XYZ", False, taps, cutoff, rate, transition)
    after, still_seen = trajectory(app)
    kernel = fir(taps, cutoff, rate or 100, transition)
    for axis in range(3):
        np.testing.assert_allclose(after[axis], filtered(before[axis], seen, kernel), rtol=1e-9, atol=1e-9)
    assert (still_seen == seen).all()
    assert (after[:, ~seen] == before[:, ~seen]).all()


@pytest.mark.parametrize("window, weights", [(1, [1]), (9, np.ones(9)), (5, signal.windows.triang(5))])
def test_weighted_average_matches_the_same_weights_applied_with_scipy(app, window, weights):
    obj, channels = marker(app)
    before, seen = trajectory(app)
    weighting = 0 if np.all(np.asarray(weights) == weights[0]) else 1
    app.FilterApplyWeightedAverage(obj, channels["Z"], "XYZ", False, window, weighting)
    after, _ = trajectory(app)
    kernel = np.asarray(weights, dtype=float) / np.sum(weights)
    for axis in range(3):
        np.testing.assert_allclose(after[axis], filtered(before[axis], seen, kernel), rtol=1e-9, atol=1e-9)


def test_an_empty_component_filters_only_the_named_channel(app):
    obj, channels = marker(app)
    before, seen = trajectory(app)
    app.FilterApplyWeightedAverage(obj, channels["Y"], "", False, 7, 0)
    after, _ = trajectory(app)
    assert (after[0] == before[0]).all() and (after[2] == before[2]).all()
    assert not (after[1] == before[1]).all()


def test_selected_only_uses_and_changes_the_selected_frames_alone(app):
    obj, channels = marker(app)
    before, seen = trajectory(app)
    app.TimelineSelectRange(50, 100, 0)
    app.FilterApplyFIR(obj, channels["X"], "", True, 11, 5, 100, 0)
    after, _ = trajectory(app)
    selected = np.zeros(FRAMES, dtype=bool)
    selected[49:100] = True
    np.testing.assert_allclose(after[0], filtered(before[0], seen & selected, fir(11, 5, 100, 0)), rtol=1e-9)
    assert (after[0, ~selected] == before[0, ~selected]).all()


@pytest.mark.parametrize("operation, constants, how", [
    ("FilterApplyFIR", (31, 6, 0, 2), "low-pass of 31 taps, cut-off 6 Hz, transition 2 Hz, sample rate 100 Hz"),
    ("FilterApplyFIR", (5, 0.1, 1, 0.3), "low-pass of 5 taps, cut-off 0.1 Hz, transition 0.3 Hz, sample rate 1 Hz"),
    ("FilterApplyWeightedAverage", (5, 1), "triangular average over 5 frames"),
    ("FilterApplyWeightedAverage", (1, 0), "uniform average over 1 frame"),
])
def test_a_filter_says_how_many_samples_it_changed(app, operation, constants, how):
    obj, channels = marker(app)
    values, seen = trajectory(app)
    seen[100] = seen[103] = False  # frames 101 and 102 (indices) become a stretch of two
    app.SetTrajectory(*MARKER, *[list(v) for v in values], [bool(v) for v in seen])
    code, text = app.result(operation, obj, channels["X"], "XYZ", False, *constants)
    after, _ = trajectory(app)
    half = constants[0] // 2
    short = 3 * sum(end - first for first, end in runs(seen) if end - first <= half)
    expected = f"{(after != values).sum()} of {3 * seen.sum() - short} samples changed in 3 channels ({how})"
    if short:
        expected += f"; {short} samples in stretches of {half} keyed frames or fewer left as they were"
    assert (code, text) == (0, expected)


REFUSED = [
    ("FilterApplyFIR", ("", False, 0, 5, 100, 0), "the number of taps must be an odd number from 1 to the take's 300 frames, not 0"),
    ("FilterApplyFIR", ("", False, 4, 5, 100, 0), "not 4"),
    ("FilterApplyFIR", ("", False, 301, 5, 100, 0), "not 301"),
    ("FilterApplyFIR", ("", False, 5, 50, 100, 0), "below the Nyquist frequency, 50 Hz"),
    ("FilterApplyFIR", ("", False, 5, 45, 100, 10), "below the Nyquist frequency, 50 Hz"),
    ("FilterApplyFIR", ("", False, 5, 0, 100, 0), "must be above 0"),
    ("FilterApplyFIR", ("", False, 5, 5, -100, 0), "the sample rate must be above 0 Hz"),
    ("FilterApplyFIR", ("", False, 5, 5, 100, -1), "the transition band must be 0 Hz or wider"),
    ("FilterApplyFIR", ("XY", False, 5, 5, 100, 0), "component 'XY' is not"),
    ("FilterApplyFIR", ("", True, 5, 5, 100, 0), "no frame is selected"),
    ("FilterApplyWeightedAverage", ("", False, 0, 0), "the window must be an odd number from 1 to the take's 300 frames, not 0"),
    ("FilterApplyWeightedAverage", ("", False, 5, 2), "weighting 2 is not 0 (uniform) or 1 (triangular)"),
]


@pytest.mark.parametrize("operation, args, message", REFUSED)
def test_bad_constants_are_refused_and_change_nothing(app, tmp_path, operation, args, message):
    obj, channels = marker(app)
    before = app.scene_file(tmp_path / "scene")
    assert message in app.result(operation, obj, channels["X"], *args)[1]
    assert app.scene_file(tmp_path / "scene") == before


def test_a_channel_of_another_object_is_refused_by_its_id(app):
    obj, _ = marker(app)
    other = app.SceneGetObject("/Alice/LANK")[0]
    other_x = int(app.ObjectGetChannel(other, "X")[2])
    refused = app.result("FilterApplyFIR", obj, other_x, "", False, 5, 5, 100, 0)[1]
    assert refused == f"object {obj} has no channel with id {other_x}"
