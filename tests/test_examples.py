"""The examples run against their own application, and a strict type check passes on them."""
import glob
import os
import sys

import pytest

import hostproc

ROOT = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
EXAMPLES = sorted(glob.glob(os.path.join(ROOT, "examples", "*.py")))


def run(*arguments, cwd):
    return hostproc.run_in_session([sys.executable, *arguments], timeout=120, cwd=cwd)


def test_session_prints_the_account_and_writes_the_plot(tmp_path):
    done = run(os.path.join(ROOT, "examples", "session.py"), cwd=tmp_path)
    assert done.returncode == 0, done.stderr
    lines = done.stdout.splitlines()
    assert lines[0] == "Pellux Post 1.0.0"
    assert lines[1] == "scene 'Demo', frames 1 to 1000 at 100 Hz (10 s)"
    assert "subject Alice:" in lines and "subject Bob:" in lines
    assert "  RWRA   seen in   920 frames, 1 gap(s)" in lines
    assert "  /Alice     Subject   37 objects below" in lines
    assert "saved, emptied (0 subjects) and reloaded: subjects Alice, Bob" in lines
    assert "occlusion fixing and a 6 Hz low-pass: 80 frames of Alice's RWRA filled" in lines
    with open(tmp_path / "session.png", "rb") as plot:
        assert plot.read(8) == b"\x89PNG\r\n\x1a\n"


def test_session_reports_an_unknown_marker(tmp_path):
    done = run(os.path.join(ROOT, "examples", "session.py"), "--marker", "XYZ", "--out", "x.png", cwd=tmp_path)
    assert done.returncode != 0
    assert "no marker named 'XYZ'" in done.stderr
    assert not (tmp_path / "x.png").exists()


@pytest.mark.parametrize("example, expected", [
    ("numpy_trajectories.py", ["Alice  RWRA    920 frames seen, mean speed 1.18 m/s"]),
    ("write_trajectory.py", ["Alice's RWRA: 80 frames unseen before, 0 after"]),
    ("process_request.py", ["ReleaseType    Release", "Value=1680"]),
    ("batch.py", ["take12.scene       9       8     1", "take13.scene       9       7     2"]),
])
def test_example_runs_against_its_own_application(tmp_path, example, expected):
    done = run(os.path.join(ROOT, "examples", example), cwd=tmp_path)
    assert done.returncode == 0, done.stderr
    for line in expected:
        assert line in done.stdout.splitlines()


def test_examples_pass_a_strict_type_check():
    done = run("-m", "mypy", "--strict", "--no-incremental", *EXAMPLES, cwd=ROOT)
    assert done.returncode == 0, done.stdout
