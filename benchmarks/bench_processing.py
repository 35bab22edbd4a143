"""Two processing commands of the application beside the same computation done with NumPy/SciPy:

1. FilterApplyFIR over one marker's X, Y and Z (100,000 frames, 61 taps), against the same
   coefficients applied with scipy.signal.convolve to each stretch of seen frames;
2. OfflineFixOcclusion over both demo subjects (100,000 frames), against the same fills (rigid from a
   neighbour of the same segment, else cubic Hermite) worked out with NumPy and SciPy.

    python benchmarks/bench_processing.py            # 100,000 frames, best of 5 rounds
    python benchmarks/bench_processing.py --quick    # 2,000 frames, 2 rounds: only checks that everything runs

The application's figure is one call from the script, round trip included; the NumPy/SciPy figure
is the computation alone, on data fetched beforehand. Each round checks that both give the same
values. Starts its own client3-host on a free loopback port and stops it before the end.
"""
import argparse
import sys
import time

import numpy
from scipy import interpolate, signal

import Client3
from Client3.testing import running_host

SUBJECTS = ("Alice", "Bob")
FIR_MARKER = ("Alice", "RANK")  # a marker with a gap
TAPS, CUTOFF, TRANSITION = 61, 6.0, 4.0
LONGEST_GAP = 50  # frames: the default TransitionTime, 0.5 s, at 100 frames per second


def runs(mask):
    """(first, end) of every stretch of True."""
    edges = numpy.flatnonzero(numpy.diff(numpy.concatenate([[0], mask.astype(numpy.int8), [0]])))
    return list(zip(edges[::2], edges[1::2]))


def fir_with_scipy(values, seen, kernel):
    """The kernel over each stretch of seen frames on its own, each extended by its odd reflection."""
    out = values.copy()
    half = len(kernel) // 2
    for first, end in runs(seen):
        part = values[:, first:end]
        if part.shape[1] <= half:
            continue
        left = 2 * part[:, :1] - part[:, half:0:-1]
        right = 2 * part[:, -1:] - part[:, -2:-half - 2:-1]
        extended = numpy.concatenate([left, part, right], axis=1)
        for axis in range(3):
            out[axis, first:end] = signal.convolve(extended[axis], kernel, mode="valid")
    return out


def slope(values, seen, at, step):
    """The data's slope at frame `at` from the frames beyond it on the side of `step` (-1 or 1): second
    order from two seen frames, first order from one, None from none."""
    near, far = at + step, at + 2 * step
    if 0 <= far < len(seen) and seen[near] and seen[far]:
        return -step * (3 * values[:, at] - 4 * values[:, near] + values[:, far]) / 2
    if 0 <= near < len(seen) and seen[near]:
        return step * (values[:, near] - values[:, at])
    return None


def fix_with_numpy(tracks, bones):
    """Every fill of the subject's gaps, worked out from the data as it is: {marker: (first, end, values)}."""
    fills = {}
    for marker, (values, seen) in tracks.items():
        frames = len(seen)
        for first, end in runs(~seen):
            if first == 0 or end == frames or end - first > LONGEST_GAP:
                continue
            before, after = first - 1, end
            span = after - before
            frames_in = numpy.arange(first, end)
            for other, (near, near_seen) in tracks.items():
                if other != marker and bones.get(other) and bones.get(other) == bones.get(marker) \
                        and near_seen[before:after + 1].all():
                    start, stop = values[:, before] - near[:, before], values[:, after] - near[:, after]
                    blend = (frames_in - before) / span
                    fills[marker, first] = (first, end, near[:, first:end] + start[:, None] + (stop - start)[:, None] * blend)
                    break
            else:
                line = (values[:, after] - values[:, before]) / span
                m0, m1 = slope(values, seen, before, -1), slope(values, seen, after, 1)
                spline = interpolate.CubicHermiteSpline([before, after], values[:, [before, after]],
                                                        numpy.stack([line if m0 is None else m0, line if m1 is None else m1], axis=1),
                                                        axis=1)
                fills[marker, first] = (first, end, spline(frames_in))
    return fills


def timed(function, *args):
    start = time.perf_counter()
    result = function(*args)
    return time.perf_counter() - start, result


def fetch(client, subject, marker):
    record = client.GetTrajectory(subject, marker).check()
    x, y, z, seen = record.arrays()
    return numpy.array([x, y, z]), numpy.array(seen, dtype=bool)


def bench_fir(client, frames, rounds, figures):
    marker = client.SceneGetObject("/" + "/".join(FIR_MARKER)).check().ID
    channel = int(str(client.ObjectGetChannel(marker, "X").check().Str))
    kernel = signal.firwin(TAPS, CUTOFF + TRANSITION / 2, window="hamming", fs=100)
    for _ in range(rounds):
        values, seen = fetch(client, *FIR_MARKER)
        host, _ = timed(lambda: client.FilterApplyFIR(marker, channel, "XYZ", False, TAPS, CUTOFF, 0, TRANSITION).check())
        scipy_seconds, expected = timed(fir_with_scipy, values, seen, kernel)
        numpy.testing.assert_allclose(fetch(client, *FIR_MARKER)[0], expected, rtol=1e-9, atol=1e-9)
        figures["fir host"] = min(figures.get("fir host", host), host)
        figures["fir scipy"] = min(figures.get("fir scipy", scipy_seconds), scipy_seconds)


def bench_fix(client, frames, rounds, figures):
    markers = {s: [str(m) for m in client.GetMarkerNames(s).check().Names] for s in SUBJECTS}
    bones = {}
    for subject in SUBJECTS:
        for name in client.GetConstraintNames(subject, "").check().Names:
            details = client.GetConstraintDetails(subject, "", str(name)).check()
            bones[subject, str(details.Source)] = str(details.Target)
    original = {(s, m): fetch(client, s, m) for s in SUBJECTS for m in markers[s]}
    for _ in range(rounds):
        for (subject, marker), (values, seen) in original.items():
            client.SetTrajectory(subject, marker, values[0], values[1], values[2], seen.tolist()).check()
        host, _ = timed(lambda: client.OfflineFixOcclusion("", "").check())
        numpy_seconds = 0.0
        for subject in SUBJECTS:
            tracks = {m: original[subject, m] for m in markers[subject]}
            seconds, fills = timed(fix_with_numpy, tracks, {m: bones.get((subject, m)) for m in markers[subject]})
            numpy_seconds += seconds
            for (marker, _), (first, end, values) in fills.items():
                filled = fetch(client, subject, marker)[0][:, first:end]
                if numpy.abs(filled - values).max() > 1e-6:
                    raise RuntimeError(f"{subject} {marker} frames {first + 1}-{end}: the application and NumPy differ")
        figures["fix host"] = min(figures.get("fix host", host), host)
        figures["fix numpy"] = min(figures.get("fix numpy", numpy_seconds), numpy_seconds)


def main(argv=None):
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--quick", action="store_true", help="a short take and two rounds, to check that it runs")
    options = parser.parse_args(argv)
    frames, rounds = (2_000, 2) if options.quick else (100_000, 5)

    figures = {}
    with running_host(frames=frames, log=False) as host, Client3.connect(host.address, host.port) as client:
        bench_fir(client, frames, rounds, figures)
        bench_fix(client, frames, rounds, figures)

    print(f"Processing over {frames:,} frames; best of {rounds} rounds")
    print(f"  {'':58} {'ms':>9} {'x NumPy':>8}")
    rows = [
        (f"FilterApplyFIR, one marker, {TAPS} taps: NumPy/SciPy", "fir scipy", "fir scipy"),
        (f"FilterApplyFIR, one marker, {TAPS} taps: client3-host", "fir host", "fir scipy"),
        ("OfflineFixOcclusion, both subjects: NumPy/SciPy", "fix numpy", "fix numpy"),
        ("OfflineFixOcclusion, both subjects: client3-host", "fix host", "fix numpy"),
    ]
    for label, name, base in rows:
        print(f"  {label:<58} {figures[name] * 1e3:9.3f} {figures[name] / figures[base]:8.2f}")
    return 0


if __name__ == "__main__":
    sys.exit(main())
