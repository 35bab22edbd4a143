"""The benchmarks keep working: each runs once in its quick form and prints its rows, each with a
figure. The figures themselves are not checked."""
import os
import platform
import re
import subprocess
import sys

import pytest

from conftest import SANITIZED

BENCHMARKS = os.path.join(os.path.dirname(os.path.dirname(os.path.abspath(__file__))), "benchmarks")
# The C heap is measured through the GNU C library, whose counts the sanitizer's allocator bypasses.
HEAP_MEASURED = platform.libc_ver()[0] == "glibc" and not SANITIZED

ROWS = {
    "bench_client.py": ["GetFrameCount round trip:", "GetTrajectory, one marker over 100000 frames:",
                        "C++ ping-pong, two threads (floor)", "Python socket client, C++ server",
                        "raw C++ client, client3-host", "_Client3 GetFrameCount, client3-host",
                        "C++ send + four std::vectors (floor)", "_Client3 GetTrajectory, client3-host", "goal: "],
    "bench_buffers.py": ["GetTrajectory + numpy.frombuffer of the same bytes (floor)", "GetTrajectory + record.arrays()",
                         "GetTrajectory + element by element", "goal: "],
    "suite.py": ["machine: ", "interpreter: ", "int field get (one object)", "string field get", "vector field get",
                 "SafeString_Value", "ToString(1003)", "vectord___len__", "client call, unconnected (GetFrameCount)",
                 "int field set (tuple of 2)", "vectord_assign (tuple of 3)", "client call, tuple of 8 (ChannelSetValue)",
                 "vectord___getitem__(v, 3) (overloaded, by type)", "SwigPyIterator_incr + decr (overloaded, tuple of 1)",
                 "iteration, per element (SwigPyIterator___next__)", "list of floats -> vectord",
                 "tuple of floats -> vectord", "list of bools -> vectorb", "import (self time)",
                 "Client3 GetFrameCount, unconnected", "Client3 ParameterGet, unconnected, by keyword",
                 "Client3 GetTrajectoryAtFrame, host, by position", "Client3 GetTrajectoryAtFrame, host, by keyword",
                 "round trip to the host (GetFrameCount)", "import Client3 (with what it imports)",
                 *(["memory per element, vectord"] if HEAP_MEASURED else [])],
    "bench_processing.py": [f"{command}: {who}"
                            for command in ("FilterApplyFIR, one marker, 61 taps", "OfflineFixOcclusion, both subjects")
                            for who in ("NumPy/SciPy", "client3-host")],
    "bench_batch.py": ["process pool", "Dask", "goal: "],
    "bench_load.py": ["4 clients, 800 calls in ", "write", "read", "trajectory", "count", "markers", "subjects", "all",
                      "host memory: ", "cells written: "],
    "bench_c3d.py": ["sample_", "goal: "],
}


@pytest.mark.parametrize("script", ROWS)
def test_benchmark_prints_its_rows_in_its_quick_form(script):
    done = subprocess.run([sys.executable, os.path.join(BENCHMARKS, script), "--quick"],
                          capture_output=True, text=True, timeout=600)
    assert done.returncode == 0, done.stdout + done.stderr
    lines = [line.strip().lstrip("|").strip() for line in done.stdout.splitlines()]
    for row in ROWS[script]:
        found = [line for line in lines if line.startswith(row)]
        assert found and all(re.search(r"\d", line[len(row):]) for line in found), (row, done.stdout)
