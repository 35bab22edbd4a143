"""A trajectory of one marker over 100,000 frames from GetTrajectory to four NumPy arrays, three ways:

1. record.arrays(): X, Y and Z as views of the record's storage, E copied out of its packed bits;
2. numpy.frombuffer over bytes of the same sizes made beforehand (the floor: no conversion at all);
3. element by element through __getitem__, the path that the views replace.

    python benchmarks/bench_buffers.py            # best of 7 rounds
    python benchmarks/bench_buffers.py --quick    # 1,000 frames, 2 rounds: only checks that everything runs

Each row is measured with the GetTrajectory call and without it. Starts its own client3-host on a free
loopback port and stops it before the end; the contenders take turns, each keeping its best round.
"""
import argparse
import sys
import time

import numpy

import Client3
from Client3.testing import running_host

SUBJECT, MARKER = "Alice", "LANK"


def best_of(seconds, name, figures):
    figures[name] = min(figures.get(name, seconds), seconds)


def timed(function, *args):
    start = time.perf_counter()
    result = function(*args)
    return time.perf_counter() - start, result


def by_arrays(record):
    return record.arrays()


def by_frombuffer(floor):
    x, y, z, e = floor
    return (numpy.frombuffer(x, numpy.float64), numpy.frombuffer(y, numpy.float64), numpy.frombuffer(z, numpy.float64),
            numpy.frombuffer(e, numpy.bool_))


def by_elements(record):
    arrays = []
    for vector in (record.X, record.Y, record.Z, record.E):
        arrays.append(numpy.array([vector[i] for i in range(len(vector))]))
    return tuple(arrays)


def main(argv=None):
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--quick", action="store_true", help="a short take and two rounds, to check that it runs")
    options = parser.parse_args(argv)
    frames, rounds = (1_000, 2) if options.quick else (100_000, 7)

    figures = {}
    with running_host(frames=frames, log=False) as host, Client3.connect(host.address, host.port) as client:
        record = client.GetTrajectory(SUBJECT, MARKER).check()
        if len(record.X) != frames:
            raise RuntimeError(f"GetTrajectory gave {len(record.X)} frames, not {frames}")
        # The floor's bytes: the same sizes as the record's fields, ready before the clock starts.
        floor = tuple(bytes(8 * frames) for _ in range(3)) + (bytes(frames),)
        expected = [numpy.asarray(v) for v in (record.X, record.Y, record.Z)]
        for _ in range(rounds):
            for name, convert, source in (("arrays", by_arrays, None), ("frombuffer", by_frombuffer, floor),
                                          ("elements", by_elements, None)):
                seconds, fetched = timed(client.GetTrajectory, SUBJECT, MARKER)
                converting, result = timed(convert, fetched if source is None else source)
                best_of(seconds + converting, name, figures)
                best_of(converting, name + " alone", figures)
                if source is None and not all(numpy.array_equal(a, b) for a, b in zip(result, expected)):
                    raise RuntimeError(f"{name} gave other values than the record holds")
                del result, fetched

    print(f"GetTrajectory, one marker over {frames:,} frames, to four NumPy arrays; best of {rounds} rounds")
    print(f"  {'':60} {'ms':>9} {'x floor':>8}")
    rows = [
        ("GetTrajectory + numpy.frombuffer of the same bytes (floor)", "frombuffer"),
        ("GetTrajectory + record.arrays()", "arrays"),
        ("GetTrajectory + element by element", "elements"),
    ]
    for label, name in rows:
        print(f"  {label:<60} {figures[name] * 1e3:9.3f} {figures[name] / figures['frombuffer']:8.2f}")
    print("  the conversion alone:")
    for label, name in rows:
        label = label.replace("GetTrajectory + ", "").replace(" (floor)", "")
        print(f"    {label:<58} {figures[name + ' alone'] * 1e3:9.3f}")
    ratio = figures["arrays"] / figures["frombuffer"]
    print(f"  goal: record.arrays() at most 1.20 x floor: {'met' if ratio <= 1.2 else 'missed'} ({ratio:.2f})")
    return 0


if __name__ == "__main__":
    sys.exit(main())
