"""The benchmarks keep working: each runs once in its quick form and prints its rows, each with a
figure. The figures themselves are not checked."""
import os
import platform
import re
import sys

import pytest

import hostproc
from conftest import SANITIZED

BENCHMARKS = os.path.join(os.path.dirname(os.path.dirname(os.path.abspath(__file__))), "benchmarks")
# The C heap is measured through the GNU C library, whose counts the sanitizer's allocator bypasses.
HEAP_MEASURED = platform.libc_ver()[0] == "glibc" and not SANITIZED

# A few rows of each, from its first measurement to its last.
ROWS = {
    "bench_client.py": ["GetFrameCount round trip:", "_Client3 GetTrajectory, client3-host", "goal: "],
    "bench_buffers.py": ["GetTrajectory + numpy.frombuffer of the same bytes (floor)", "GetTrajectory + element by element"],
    "suite.py": ["int field get (one object)", "import Client3 (with what it imports)",
                 *(["memory per element, vectord"] if HEAP_MEASURED else [])],
    "bench_processing.py": ["FilterApplyFIR, one marker, 61 taps: NumPy/SciPy", "OfflineFixOcclusion, both subjects: client3-host"],
    "bench_batch.py": ["process pool", "Dask", "goal: "],
    "bench_load.py": ["4 clients, 800 calls in ", "all", "host memory: ", "cells written: "],
    "bench_c3d.py": ["sample_", "goal: "],
}


@pytest.mark.parametrize("script", ROWS)
def test_benchmark_prints_its_rows_in_its_quick_form(script):
    done = hostproc.run_in_session([sys.executable, os.path.join(BENCHMARKS, script), "--quick"], timeout=300)
    assert done.returncode == 0, done.stdout + done.stderr
    lines = [line.strip().lstrip("|").strip() for line in done.stdout.splitlines()]
    for row in ROWS[script]:
        found = [line for line in lines if line.startswith(row)]
        assert found and all(re.search(r"\d", line[len(row):]) for line in found), (row, done.stdout)
