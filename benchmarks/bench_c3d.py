"""C3D files through the application against the pure-Python reader, on every real file of
data/c3d: ImportFile (replacing the scene) and ExportFile as a script calls them, and the `c3d`
package reading the same file, every frame with its analog samples.

    python benchmarks/bench_c3d.py            # best of 7 runs of each
    python benchmarks/bench_c3d.py --quick    # two files, one run: only checks that everything runs

Beside the export, its floor: writing the exported bytes to a new file and putting it in place of the
old one, as the application does, from Python. Each contender runs its rounds in a row on a file and
keeps its best. Starts its own client3-host on a free loopback port and stops it before the end. The
goal: import and export at least 10x faster than the reader on every file.
"""
import argparse
import os
import tempfile
import time
import warnings
from pathlib import Path

import numpy

import c3d
import Client3
from Client3.testing import running_host

CORPUS = Path(__file__).resolve().parent.parent / "data" / "c3d"
GOAL = 10.0


class Reader(c3d.Reader):
    def get_analog_transform(self):
        # The reader fails on the analog scaling of a file without analog channels (sample_34):
        # there is nothing to scale.
        if self.analog_used == 0:
            return numpy.ones((0, 0)), numpy.zeros((0, 0))
        return super().get_analog_transform()


def read_with_package(path):
    with warnings.catch_warnings(), open(path, "rb") as handle:
        warnings.simplefilter("ignore")
        reader = Reader(handle)
        return sum(1 for _ in reader.read_frames(copy=False))


def timed(function, *args):
    start = time.perf_counter()
    function(*args)
    return time.perf_counter() - start


def write_file(out, data):
    with open(out + ".partial", "wb") as handle:
        handle.write(data)
    os.replace(out + ".partial", out)


def measure(client, path, out, rounds):
    """Best seconds of the reader, the import, the export and the export's floor on one file."""
    contenders = [lambda: read_with_package(path), lambda: client.ImportFile(str(path), "", False).check(),
                  lambda: client.ExportFile(out, "").check()]
    best = [min(timed(contender) for _ in range(rounds)) for contender in contenders]
    exported = Path(out).read_bytes()
    return best + [min(timed(write_file, out, exported) for _ in range(rounds))]


def main(argv=None):
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--quick", action="store_true", help="two files and one round, to check that it runs")
    options = parser.parse_args(argv)
    files = sorted(p for p in CORPUS.glob("*.c3d") if "bad_parameter" not in p.name)
    if not files:
        raise SystemExit(f"no C3D files in {CORPUS}")
    files, rounds = (files[:2], 1) if options.quick else (files, 7)

    rows = []
    with running_host(log=False) as host, Client3.connect(host.address, host.port) as client, \
            tempfile.TemporaryDirectory() as folder:
        out = os.path.join(folder, "out.c3d")
        for path in files:
            rows.append((path.name, *measure(client, path, out, rounds)))

    print(f"C3D files: ImportFile and ExportFile through client3-host against the pure-Python reader "
          f"(c3d {c3d.__version__}); best of {rounds} runs, milliseconds; floor: the export's bytes written")
    print(f"| {'file':56} | {'reader':>7} | {'import':>7} | {'x':>5} | {'export':>7} | {'x':>5} | {'floor':>7} |")
    lowest = float("inf")
    for name, reader, ours_in, ours_out, floor in rows:
        faster_in, faster_out = reader / ours_in, reader / ours_out
        lowest = min(lowest, faster_in, faster_out)
        print(f"| {name:56} | {reader * 1e3:7.2f} | {ours_in * 1e3:7.2f} | {faster_in:5.1f} | "
              f"{ours_out * 1e3:7.2f} | {faster_out:5.1f} | {floor * 1e3:7.2f} |")
    print(f"goal: import and export at least {GOAL:.0f}x faster than the reader on every file: "
          f"{'met' if lowest >= GOAL else 'missed'} (lowest {lowest:.0f}x)")


if __name__ == "__main__":
    main()
