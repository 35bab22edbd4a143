"""The benchmarks keep working: each runs once in its quick form. Their figures are not checked."""
import os
import subprocess
import sys

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
