"""The benchmarks keep working: each runs once in its quick form. Their figures are not checked."""
import os
import platform
import subprocess
import sys

from conftest import SANITIZED

BENCHMARKS = os.path.join(os.path.dirname(os.path.dirname(os.path.abspath(__file__))), "benchmarks")


def test_bench_client_quick_prints_its_table():
    done = subprocess.run([sys.executable, os.path.join(BENCHMARKS, "bench_client.py"), "--quick"],
                          capture_output=True, text=True, timeout=600)
    assert done.returncode == 0, done.stderr
    lines = done.stdout.splitlines()
    for heading in ("GetFrameCount round trip:", "GetTrajectory, one marker over 100000 frames:"):
        assert any(line.startswith(heading) for line in lines), done.stdout
    for row in ("C++ ping-pong, two threads (floor)", "Python socket client, C++ server", "raw C++ client, client3-host",
                "_Client3 GetFrameCount, client3-host", "C++ send + four std::vectors (floor)",
                "_Client3 GetTrajectory, client3-host"):
        assert any(line.strip().startswith(row) and len(line.split()) > len(row.split()) for line in lines), (row, done.stdout)
    assert sum(line.strip().startswith("goal: ") for line in lines) == 2, done.stdout


def test_bench_buffers_quick_prints_its_table():
    done = subprocess.run([sys.executable, os.path.join(BENCHMARKS, "bench_buffers.py"), "--quick"],
                          capture_output=True, text=True, timeout=600)
    assert done.returncode == 0, done.stderr
    lines = [line.strip() for line in done.stdout.splitlines()]
    for row in ("GetTrajectory + numpy.frombuffer of the same bytes (floor)", "GetTrajectory + record.arrays()",
                "GetTrajectory + element by element"):
        assert any(line.startswith(row) and len(line.split()) == len(row.split()) + 2 for line in lines), (row, done.stdout)
    assert sum(line.startswith("goal: ") for line in lines) == 1, done.stdout


def test_suite_quick_prints_every_row_against_its_floor():
    done = subprocess.run([sys.executable, os.path.join(BENCHMARKS, "suite.py"), "--quick"],
                          capture_output=True, text=True, timeout=600)
    assert done.returncode == 0, done.stderr
    rows = {}
    for line in done.stdout.splitlines():
        cells = [cell.strip() for cell in line.strip("|").split("|")]
        if line.startswith("| ") and len(cells) == 4:
            rows[cells[0]] = cells[1:]
    assert any(line.startswith("machine: ") for line in done.stdout.splitlines()), done.stdout
    assert any(line.startswith("interpreter: ") for line in done.stdout.splitlines()), done.stdout
    with_floor = ["int field get (one object)", "string field get", "vector field get", "SafeString_Value",
                  "ToString(1003)", "vectord___len__", "client call, unconnected (GetFrameCount)",
                  "int field set (tuple of 2)", "vectord_assign (tuple of 3)", "client call, tuple of 8 (ChannelSetValue)",
                  "vectord___getitem__(v, 3) (overloaded, by type)", "SwigPyIterator_incr + decr (overloaded, tuple of 1)",
                  "iteration, per element (SwigPyIterator___next__)", "list of floats -> vectord",
                  "tuple of floats -> vectord", "list of bools -> vectorb", "import (self time)",
                  "Client3 GetFrameCount, unconnected", "Client3 ParameterGet, unconnected, by keyword",
                  "Client3 GetTrajectoryAtFrame, host, by position", "Client3 GetTrajectoryAtFrame, host, by keyword"]
    # The C heap is measured through the GNU C library, whose counts the sanitizer's allocator bypasses.
    if platform.libc_ver()[0] == "glibc" and not SANITIZED:
        with_floor.append("memory per element, vectord")
    for shape in with_floor:
        ours, floor, ratio = rows[shape]
        assert ours[0].isdigit() and floor[0].isdigit() and float(ratio) > 0, (shape, rows[shape])
    for shape in ("round trip to the host (GetFrameCount)", "import Client3 (with what it imports)"):
        ours, floor, ratio = rows[shape]
        assert ours[0].isdigit() and floor == ratio == "-", rows


def test_bench_processing_quick_prints_its_table():
    done = subprocess.run([sys.executable, os.path.join(BENCHMARKS, "bench_processing.py"), "--quick"],
                          capture_output=True, text=True, timeout=600)
    assert done.returncode == 0, done.stderr
    lines = [line.strip() for line in done.stdout.splitlines()]
    for command in ("FilterApplyFIR, one marker, 61 taps", "OfflineFixOcclusion, both subjects"):
        for who in ("NumPy/SciPy", "client3-host"):
            row = f"{command}: {who}"
            assert any(line.startswith(row) and len(line.split()) == len(row.split()) + 2 for line in lines), (row, done.stdout)


def test_bench_batch_quick_prints_its_table():
    done = subprocess.run([sys.executable, os.path.join(BENCHMARKS, "bench_batch.py"), "--quick"],
                          capture_output=True, text=True, timeout=600)
    assert done.returncode == 0, done.stderr
    lines = [line.split() for line in done.stdout.splitlines()]
    rates = [line for line in lines if line[-1].endswith("x") and "worker" in line]
    costs = [line for line in lines if "opening" in line and "rest" in line]
    assert [line[:2] for line in rates] == [["process", "pool"], ["Dask", "1"]], done.stdout
    assert [line[:2] for line in costs] == [["process", "pool"], ["Dask", "opening"]], done.stdout
    assert sum(line[:1] == ["goal:"] for line in lines) == 2, done.stdout


def test_bench_load_quick_prints_its_table():
    done = subprocess.run([sys.executable, os.path.join(BENCHMARKS, "bench_load.py"), "--quick"],
                          capture_output=True, text=True, timeout=600)
    assert done.returncode == 0, done.stdout + done.stderr
    lines = [line.strip() for line in done.stdout.splitlines()]
    assert lines[0].startswith("4 clients, 800 calls in "), done.stdout
    for kind in ("write", "read", "trajectory", "count", "markers", "subjects", "all"):
        assert any(line.split()[:1] == [kind] and len(line.split()) == 7 for line in lines), (kind, done.stdout)
    assert "writes lost: 0; wrong reads: 0" in done.stdout


def test_bench_c3d_quick_prints_its_table():
    done = subprocess.run([sys.executable, os.path.join(BENCHMARKS, "bench_c3d.py"), "--quick"],
                          capture_output=True, text=True, timeout=600)
    assert done.returncode == 0, done.stderr
    rows = [line.strip("|").split("|") for line in done.stdout.splitlines() if line.startswith("| sample_")]
    assert len(rows) == 2 and all(len(row) == 7 and float(row[-1]) > 0 for row in rows), done.stdout
    assert sum(line.startswith("goal: ") for line in done.stdout.splitlines()) == 1, done.stdout
