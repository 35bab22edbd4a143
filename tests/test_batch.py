"""Client3.batch on both engines (the process pool, a Dask LocalCluster of two worker processes) and
its command line: results as a serial run gives them, failures kept to their take, applications that
end during a take, interrupted batches resumed, and no process left behind."""
import json
import os
import shutil
import signal
import subprocess
import sys
import time
import uuid

import psutil
import pytest

import batchjobs
import companion
from Client3 import batch

distributed = pytest.importorskip("distributed")

HERE = os.path.dirname(os.path.abspath(__file__))
FRAMES = 200
TAKES = 6
WAIT = 60  # seconds any one process may take to start, finish or stop
CLOSE = 20  # seconds a cluster may take to close (it takes one or two)
KILLING = ("--fault", "exit=2@OfflineFixOcclusion")  # every application ends at its second fix


@pytest.fixture(scope="module", autouse=True)
def package_classes(registered_classes):
    with companion.package_classes():
        yield


@pytest.fixture(scope="module")
def takes(tmp_path_factory):
    """Demo takes, each with a gap of its own cut into Alice's LANK; the last one as CSV."""
    return batchjobs.make_takes(str(tmp_path_factory.mktemp("takes")), TAKES, FRAMES, last_as_csv=True)


@pytest.fixture(scope="module")
def serial(takes):
    """The job's value for each take, run one after the other on one application."""
    return batchjobs.run_serially(takes)


@pytest.fixture(scope="module")
def dask_cluster():
    cluster = distributed.LocalCluster(n_workers=2, threads_per_worker=1, processes=True, host="127.0.0.1", dashboard_address="127.0.0.1:0")
    try:
        with distributed.Client(cluster) as client:
            yield client
    finally:
        try:
            cluster.close(timeout=CLOSE)
        except Exception:  # seen on 3.9: a worker that Dask had started again never took the close
            stop_worker_processes()


def stop_worker_processes():
    """Kills the worker processes of this test process's clusters; their applications end with them."""
    workers = []
    for process in psutil.Process().children(recursive=True):
        try:
            if "spawn_main" in " ".join(process.cmdline()):
                workers.append(process)
                process.kill()
        except psutil.Error:  # already gone
            pass
    psutil.wait_procs(workers, timeout=WAIT)


@pytest.fixture(params=["pool", "dask"])
def engine(request):
    """run()'s keyword arguments for each engine."""
    if request.param == "pool":
        return {"workers": 2}
    return {"cluster": request.getfixturevalue("dask_cluster")}


def by_take(results):
    found = {}
    for result in results:
        assert result.take not in found, f"{result.take} given twice"
        found[result.take] = result
    return found


def test_results_equal_the_job_run_serially(engine, takes, serial):
    results = by_take(batch.run(batchjobs.fix, [*takes, takes[0]], **engine))
    assert {take: result.value for take, result in results.items()} == serial
    assert all(result.ok and result.attempts == 1 for result in results.values())
    assert len({result.worker for result in results.values()}) <= 2
    assert all(result.worker and result.seconds > 0 for result in results.values())


def test_a_failing_job_fails_its_own_take_and_the_batch_goes_on(engine, takes, serial, tmp_path):
    bad = str(tmp_path / "bad.scene")
    shutil.copy(takes[0], bad)
    results = by_take(batch.run(batchjobs.fail_marked, [takes[0], bad, *takes[1:]], **engine))
    assert len(results) == TAKES + 1
    assert (results[bad].ok, results[bad].value) == (False, "ValueError: refusing bad.scene")
    assert {take: results[take].value for take in takes} == serial


@pytest.mark.parametrize("retries", [1, 0])
def test_an_application_that_ends_during_a_take_is_started_again(engine, takes, serial, retries):
    results = by_take(batch.run(batchjobs.fix, takes, retries=retries, host_options=KILLING, **engine))
    assert set(results) == set(takes)
    for take, result in results.items():
        if result.ok:
            assert result.value == serial[take]
        else:
            assert result.value.startswith("the application ended during the take: ")
        assert result.attempts <= retries + 1
    # Two workers cannot run six takes with a single fix each: some application ended.
    assert any(result.attempts == 2 for result in results.values()) == (retries == 1)
    assert all(result.ok for result in results.values()) == (retries == 1)


# Dask retries a take whose worker ended a number of times of its own, whatever `retries` says.
@pytest.mark.parametrize("engine, retries", [("pool", 1), ("pool", 0), ("dask", 0)], indirect=["engine"])
def test_a_worker_process_that_ends_loses_no_take(engine, takes, serial, tmp_path, monkeypatch, retries):
    marker = uuid.uuid4().hex
    monkeypatch.setenv(batchjobs.MARKER, marker)  # seen by the pool's workers (Dask's were started before)
    # The takes share a folder of their own, where the bad one waits for another to run.
    copies = {str(shutil.copy(take, tmp_path)): take for take in takes}
    bad = str(tmp_path / "bad.scene")
    shutil.copy(takes[0], bad)
    results = by_take(batch.run(batchjobs.exit_marked, [bad, *copies], retries=retries, **engine))
    assert set(results) == {bad, *copies}
    # The take running beside the one that ended its process is not charged for it.
    assert {copies[take]: results[take].value for take in copies} == serial
    assert not results[bad].ok
    if "workers" in engine:
        assert results[bad].value == "the worker process ended during the take"
        assert results[bad].attempts == retries + 1
        # The applications of the workers that ended went with them.
        assert psutil.wait_procs(batchjobs.marked_processes(marker, "client3-host"), timeout=WAIT)[1] == []
    else:  # Dask gives up on the take itself, after its own number of tries
        assert results[bad].value.startswith("KilledWorker: ")


def test_an_application_that_does_not_start_fails_every_take(engine, takes):
    results = by_take(batch.run(batchjobs.fix, takes[:2], host_options=["--frames", "0"], **engine))
    assert [result.value for result in results.values()] == ["cannot start the application: "
                                                             "the application did not start: ''"] * 2


@pytest.mark.parametrize("name, content, message", [
    ("missing.scene", None, "cannot read the file '{path}' (result code 1003)"),
    ("damaged.scene", b"client3-scene 1\nframes nope\n",
     "the scene file is damaged at line 2: 'nope' is not a number from 1 to 1000000 (result code 1003)"),
    ("damaged.csv", b"Frame,A:B:X,A:B:Y,A:B:Z\n1,zz,1,2\n",
     "the CSV file is damaged at line 2: 'zz' is not a number (result code 1003)"),
    ("damaged.c3d", b"\x02\x50" + bytes(100), "the C3D file is damaged: it does not start with a C3D header (result code 1003)"),
])
def test_a_take_that_cannot_be_opened_fails_with_the_applications_message(engine, takes, serial, tmp_path,
                                                                          name, content, message):
    path = tmp_path / name
    if content is not None:
        path.write_bytes(content)
    results = by_take(batch.run(batchjobs.fix, [str(path), takes[0]], **engine))
    assert (results[str(path)].ok, results[str(path)].value) == (False, message.format(path=path))
    assert results[takes[0]].value == serial[takes[0]]


def lines(path):
    with open(path) as file:
        return [json.loads(line) for line in file]


def written_lines(path):
    return path.read_text().splitlines() if path.exists() else []


def test_an_interrupted_batch_resumes_where_it_stopped(engine, takes, serial, tmp_path):
    out = str(tmp_path / "results.jsonl")
    first = []
    for result in batch.run(batchjobs.fix, takes, out=out, **engine):
        first.append(result.take)
        if len(first) == 2:
            break  # closing the generator stops the batch
    with open(out, "a") as file:
        file.write('{"take": "half a li')  # what an interrupted write could leave
    again = [result.take for result in batch.run(batchjobs.fix, takes, out=out, resume=True, **engine)]
    assert sorted(first + again) == sorted(takes)
    written = lines(out)
    assert sorted(line["take"] for line in written) == sorted(takes)
    assert all(line["ok"] and line["value"] == serial[line["take"]] for line in written)
    assert list(batch.run(batchjobs.fix, takes, out=out, resume=True, **engine)) == []


def test_the_pools_applications_end_with_the_batch(takes, monkeypatch):
    marker = uuid.uuid4().hex
    monkeypatch.setenv(batchjobs.MARKER, marker)
    assert len(list(batch.run(batchjobs.fix, takes, workers=2))) == TAKES
    assert psutil.wait_procs(batchjobs.marked_processes(marker, "client3-host"), timeout=WAIT)[1] == []


def test_a_dask_workers_applications_end_with_the_worker(takes, monkeypatch):
    marker = uuid.uuid4().hex
    monkeypatch.setenv(batchjobs.MARKER, marker)
    with distributed.LocalCluster(n_workers=1, threads_per_worker=2, processes=True, host="127.0.0.1", dashboard_address="127.0.0.1:0") as cluster:
        results = list(batch.run(batchjobs.fix, takes, cluster=cluster.scheduler_address))
        assert len(results) == TAKES
        assert batchjobs.marked_processes(marker, "client3-host")
    assert psutil.wait_procs(batchjobs.marked_processes(marker, "client3-host"), timeout=WAIT)[1] == []


# --- the command line -------------------------------------------------------------------------------


def command(*arguments, **options):
    """python -m Client3.batch, run from this folder so that JOB finds the jobs module."""
    return subprocess.run([sys.executable, "-m", "Client3.batch", *arguments], cwd=HERE, capture_output=True,
                          text=True, timeout=WAIT * 2, **options)


@pytest.mark.parametrize("job, bad, status, summary", [
    ("batchjobs:fix", False, 0, f"done {TAKES}, failed 0, retried 0, skipped 0, "),
    ("batchjobs:fail_marked", True, 1, f"done {TAKES}, failed 1, retried 0, skipped 0, "),
])
def test_the_command_line_exits_with_its_status_and_a_summary(takes, tmp_path, job, bad, status, summary):
    extra = [str(tmp_path / "bad.scene")] if bad else []
    for path in extra:
        shutil.copy(takes[0], path)
    done = command(job, *takes, *extra, "--workers", "2", "--out", str(tmp_path / "out.jsonl"))
    assert done.returncode == status, done.stderr
    assert done.stdout.startswith(summary) and done.stdout.endswith(" takes per second\n"), done.stdout
    assert len(lines(tmp_path / "out.jsonl")) == len(takes) + len(extra)
    assert done.stderr == "".join(f"failed: {path}: ValueError: refusing bad.scene\n" for path in extra)


@pytest.mark.parametrize("arguments, message", [
    (["nosuchmodule:fix", "x.scene"], "cannot import nosuchmodule:fix: ModuleNotFoundError: No module named 'nosuchmodule'"),
    (["batchjobs:nothing", "x.scene"], "cannot import batchjobs:nothing: AttributeError: module 'batchjobs' has no attribute 'nothing'"),
    (["batchjobs", "x.scene"], "JOB must be written module:function, not 'batchjobs'"),
    (["batchjobs:NOT_A_FUNCTION", "x.scene"], "batchjobs:NOT_A_FUNCTION is not a function"),
    (["batchjobs:fix"], "no takes given"),
    (["batchjobs:fix", "x.scene", "--resume"], "--resume needs --out"),
    (["batchjobs:fix", "x.scene", "--workers", "0"], "--workers takes a number of 1 or more"),
])
def test_a_usage_error_exits_with_2_and_one_line(arguments, message):
    done = command(*arguments)
    assert (done.returncode, done.stdout) == (2, "")
    assert done.stderr == f"python -m Client3.batch: {message}\n"


@pytest.mark.skipif(os.name != "posix", reason="process groups and SIGINT are POSIX")
def test_ctrl_c_stops_workers_and_applications_and_the_batch_resumes(takes, tmp_path):
    marker = uuid.uuid4().hex
    out = tmp_path / "out.jsonl"
    three = takes[:3]  # two workers: once two takes are done, one runs the third and the other waits
    arguments = [sys.executable, "-m", "Client3.batch", "batchjobs:slow", *three, "--workers", "2", "--out", str(out)]
    environment = dict(os.environ, **{batchjobs.MARKER: marker})
    process = subprocess.Popen(arguments, cwd=HERE, env=environment, stdout=subprocess.PIPE, stderr=subprocess.PIPE,
                               text=True, start_new_session=True)
    try:
        deadline = time.monotonic() + WAIT
        while len(written_lines(out)) < 2 and time.monotonic() < deadline and process.poll() is None:
            time.sleep(0.05)
        os.killpg(process.pid, signal.SIGINT)  # what a terminal sends on Ctrl-C
        stdout, stderr = process.communicate(timeout=WAIT)
    finally:
        if process.poll() is None:
            os.killpg(process.pid, signal.SIGKILL)
            process.communicate()
    assert process.returncode == 130, stderr
    assert stdout.endswith(" (interrupted)\n"), stdout
    assert stderr == "", stderr
    assert psutil.wait_procs(batchjobs.marked_processes(marker), timeout=WAIT)[1] == []
    first = [line["take"] for line in lines(out)]
    assert len(first) == 2
    done = command("batchjobs:fix", *three, "--out", str(out), "--resume")
    assert done.returncode == 0, done.stderr
    assert done.stdout.startswith("done 1, failed 0, retried 0, skipped 2, "), done.stdout
    assert sorted(line["take"] for line in lines(out)) == sorted(three)
