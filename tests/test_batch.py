"""Client3.batch on both engines (the process pool, and a Dask scheduler and workers started as
processes of their own, on loopback, which have Client3 but not the user's folder) and its command
line: results as a serial run gives them, failures kept to their take, applications that end during a
take, interrupted batches resumed, jobs from the user's folder sent to the workers, and no process
left behind."""
import contextlib
import json
import os
import re
import shutil
import signal
import subprocess
import sys
import threading
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
KILLING = ("--fault", "exit=2@OfflineFixOcclusion")  # every application ends at its second fix

# The batch as a user's script runs it: `python script.py ADDRESS TAKE...`, one JSON line per take.
SCRIPT = '''
import json
import sys

import Client3.batch
import steps


def in_script(client, take):
    return steps.fix(client, take)


if __name__ == "__main__":
    for result in Client3.batch.run(in_script, sys.argv[2:], cluster=sys.argv[1]):
        print(json.dumps([result.take, result.ok, result.value]), flush=True)
'''


@pytest.fixture(scope="module", autouse=True)
def package_classes(registered_classes):
    with companion.package_classes():
        yield


def environment(marker, **extra):
    """This process's environment without any PYTHONPATH of its own (the user's folders are on no
    path), marked so that what is started under it can be found."""
    env = {key: value for key, value in os.environ.items() if key != "PYTHONPATH"}
    return dict(env, **{batchjobs.MARKER: marker}, **extra)


def stop(processes):
    """Asks each process to end, and kills what is left after WAIT seconds."""
    for process in processes:
        with contextlib.suppress(psutil.Error):
            process.terminate()
    for process in psutil.wait_procs(processes, timeout=WAIT)[1]:
        with contextlib.suppress(psutil.Error):
            process.kill()


class Deployed:
    """A scheduler and `workers` worker processes started apart, in a folder of their own."""

    def __init__(self, folder, workers, pythonpath=None):
        self.marker = uuid.uuid4().hex
        self.processes = []
        self.log = os.path.join(folder, "cluster.log")
        env = environment(self.marker, **({"PYTHONPATH": pythonpath} if pythonpath else {}))
        try:
            with open(self.log, "wb") as log:
                start = dict(cwd=folder, env=env, stdin=subprocess.DEVNULL, stdout=log, stderr=log)
                where = os.path.join(folder, "scheduler.json")
                # A lost worker counts against every take it holds, those waiting in its queue too;
                # at a saturation of 1.0 a worker holds only the take it runs.
                scheduler = dict(start, env=dict(env, DASK_DISTRIBUTED__SCHEDULER__WORKER_SATURATION="1.0"))
                self._start([sys.executable, "-m", "dask", "scheduler", "--host", "127.0.0.1", "--port", "0",
                             "--no-dashboard", "--scheduler-file", where], scheduler)
                self.address = self._address(where)
                for _ in range(workers):
                    self._start([sys.executable, "-m", "dask", "worker", self.address, "--nthreads", "1",
                                 "--no-dashboard"], start)
            if workers:
                with distributed.Client(self.address, timeout=WAIT) as client:
                    client.wait_for_workers(workers, timeout=WAIT)
        except BaseException:
            self.stop()
            raise

    def _address(self, path):
        """The scheduler's address, from the file it writes once it listens."""
        deadline = time.monotonic() + WAIT
        while True:
            with contextlib.suppress(OSError, ValueError):  # not there yet, or written in part
                with open(path) as file:
                    return json.load(file)["address"]
            with open(self.log) as log:
                assert self.processes[0].poll() is None, log.read()
            assert time.monotonic() < deadline, "the scheduler did not start"
            time.sleep(0.05)

    def _start(self, command, options):
        self.processes.append(subprocess.Popen(command, **options))

    def stop(self):
        """Stops the workers, then the scheduler, then whatever they started that is still there after
        WAIT seconds; the processes that were."""
        for group in (self.processes[1:], self.processes[:1]):
            stop([psutil.Process(p.pid) for p in group if p.poll() is None])
        for process in self.processes:
            process.wait()
        left = psutil.wait_procs(batchjobs.marked_processes(self.marker), timeout=WAIT)[1]
        stop(left)
        return left


@pytest.fixture(scope="module")
def user(tmp_path_factory):
    """The user's folder: the script, the job's module beside it (the batch tests' jobs, as `steps`),
    and demo takes, each with a gap of its own cut into Alice's LANK, the last one as CSV. Nothing
    else has it on a path."""
    folder = tmp_path_factory.mktemp("user")
    shutil.copy(batchjobs.__file__, folder / "steps.py")
    (folder / "script.py").write_text(SCRIPT)
    return folder


@pytest.fixture(scope="module")
def takes(user):
    return batchjobs.make_takes(str(user), TAKES, FRAMES)


@pytest.fixture(scope="module")
def serial(takes):
    """The job's value for each take, run one after the other on one application."""
    return batchjobs.run_serially(takes)


@pytest.fixture(scope="module")
def cluster(tmp_path_factory):
    """Two workers; when they and the scheduler are stopped, the applications of the workers are gone."""
    deployed = Deployed(str(tmp_path_factory.mktemp("cluster")), workers=2)
    yield deployed
    assert deployed.stop() == [], "processes left running"


@pytest.fixture(params=["pool", "dask"])
def engine(request):
    """run()'s keyword arguments for each engine."""
    if request.param == "pool":
        return {"workers": 2}
    client = distributed.Client(request.getfixturevalue("cluster").address, timeout=WAIT)
    request.addfinalizer(client.close)
    return {"cluster": client}


def by_take(results):
    found = {}
    for result in results:
        assert result.take not in found, f"{result.take} given twice"
        found[result.take] = result
    return found


# A take's result is made by run_take, the same on both engines; Dask's results are those of the tests below.
def test_results_equal_the_job_run_serially_and_failures_stay_with_their_take(takes, serial, tmp_path):
    """Each take once, however often listed. A take the job refuses, or that the application cannot
    open (a C3D file is imported, not loaded as a scene), fails with its reason; the batch goes on."""
    shutil.copy(takes[0], tmp_path / "bad.scene")
    (tmp_path / "damaged.c3d").write_bytes(b"\x02\x50" + bytes(100))
    failing = {
        str(tmp_path / "bad.scene"): "ValueError: refusing bad.scene",
        str(tmp_path / "damaged.c3d"): "the C3D file is damaged: it does not start with a C3D header (result code 1003)",
    }
    results = by_take(batch.run(batchjobs.fail_marked, [takes[0], *failing, *takes, takes[0]], workers=2))
    assert {take: (results[take].ok, results[take].value) for take in failing} == {
        take: (False, reason) for take, reason in failing.items()}
    done = [results[take] for take in takes]
    assert {result.take: result.value for result in done} == serial
    assert all(result.ok and result.attempts == 1 for result in done)
    assert all(result.worker and result.seconds > 0 for result in done)


# The retries are counted where both engines run a take: Dask's is checked only for being passed on.
@pytest.mark.parametrize("engine, retries", [("pool", 1), ("pool", 0), ("dask", 1)], indirect=["engine"])
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
@pytest.mark.parametrize("engine, retries", [("pool", 1), ("dask", 0)], indirect=["engine"])
def test_a_worker_process_that_ends_loses_no_take(engine, takes, serial, tmp_path, monkeypatch, retries):
    marker = uuid.uuid4().hex
    monkeypatch.setenv(batchjobs.MARKER, marker)  # seen by the pool's workers (Dask's were started before)
    # The takes share a folder of their own, where the bad one waits for another to run.
    copies = {str(shutil.copy(take, tmp_path)): take for take in takes}
    bad = str(tmp_path / "bad.scene")
    shutil.copy(takes[0], bad)
    results = by_take(batch.run(batchjobs.exit_marked, [bad, *copies], retries=retries, **engine))
    # The take running beside the one that ended its process is not charged for it.
    assert {copies[take]: results[take].value for take in copies} == serial
    assert not results[bad].ok
    if "workers" in engine:
        assert results[bad].value == "the worker process ended during the take"
        assert results[bad].attempts == retries + 1
        # The applications of every worker, those that ended too, end with the batch.
        assert psutil.wait_procs(batchjobs.marked_processes(marker, "client3-host"), timeout=WAIT)[1] == []
    else:  # Dask gives up on the take itself, after its own number of tries
        assert results[bad].value.startswith("KilledWorker: ")


def test_an_application_that_does_not_start_fails_every_take(takes):
    results = by_take(batch.run(batchjobs.fix, takes[:2], host_options=["--frames", "0"], workers=2))
    assert [result.value for result in results.values()] == ["cannot start the application: "
                                                             "the application did not start: ''"] * 2


def lines(path):
    with open(path) as file:
        return [json.loads(line) for line in file]


def written_lines(path):
    return path.read_text().splitlines() if path.exists() else []


# Resumption and the results file are run()'s, the same for both engines.
def test_an_interrupted_batch_resumes_where_it_stopped(takes, serial, tmp_path):
    out = str(tmp_path / "results.jsonl")
    first = []
    for result in batch.run(batchjobs.fix, takes, out=out, workers=2):
        first.append(result.take)
        if len(first) == 2:
            break  # closing the generator stops the batch
    with open(out, "a") as file:
        file.write('{"take": "half a li')  # what an interrupted write could leave
    again = [result.take for result in batch.run(batchjobs.fix, takes, out=out, resume=True, workers=2)]
    assert sorted(first + again) == sorted(takes)
    written = lines(out)
    assert sorted(line["take"] for line in written) == sorted(takes)
    assert all(line["ok"] and line["value"] == serial[line["take"]] for line in written)


# --- the command line -------------------------------------------------------------------------------


def command(*arguments, **options):
    """python -m Client3.batch, run from this folder so that JOB finds the jobs module."""
    return subprocess.run([sys.executable, "-m", "Client3.batch", *arguments], cwd=HERE, capture_output=True,
                          text=True, timeout=WAIT * 2, **options)


def test_the_command_line_exits_with_1_a_summary_and_the_failures(takes, tmp_path):
    """(Its status 0 when every take is done: the resumed batch of the Ctrl-C test.)"""
    bad = str(tmp_path / "bad.scene")
    shutil.copy(takes[0], bad)
    done = command("batchjobs:fail_marked", *takes, bad, "--workers", "2")
    assert done.returncode == 1, done.stderr
    assert done.stdout.startswith(f"done {TAKES}, failed 1, retried 0, skipped 0, "), done.stdout
    assert done.stdout.endswith(" takes per second\n"), done.stdout
    assert done.stderr == f"failed: {bad}: ValueError: refusing bad.scene\n"


@pytest.mark.parametrize("arguments, message", [
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
    env = dict(os.environ, **{batchjobs.MARKER: marker})
    process = subprocess.Popen(arguments, cwd=HERE, env=env, stdout=subprocess.PIPE, stderr=subprocess.PIPE,
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


# --- on a deployed cluster -----------------------------------------------------------------------


def run_script(user, takes, cluster):
    """Runs the user's script from another folder; its exit status, results and errors."""
    done = subprocess.run([sys.executable, str(user / "script.py"), cluster.address, *takes], cwd=str(user.parent),
                          env=environment(cluster.marker), capture_output=True, text=True, timeout=WAIT * 2)
    results = [json.loads(line) for line in done.stdout.splitlines()]
    return done.returncode, {take: (ok, value) for take, ok, value in results}, done.stderr


def test_a_job_from_the_users_script_runs_on_workers_that_lack_its_folder(user, takes, serial, cluster):
    status, results, errors = run_script(user, takes, cluster)
    assert status == 0, errors
    assert results == {take: (True, value) for take, value in serial.items()}


def test_a_job_that_needs_a_module_the_workers_lack_stops_before_its_first_take(user, takes, cluster, tmp_path):
    # The job's module, from the user's folder, is sent to the workers; it imports one that only this
    # machine has, on a path outside that folder.
    (tmp_path / "onlyhere.py").write_text("UNSEEN = 'unseen'\n")
    (user / "needy.py").write_text("import onlyhere\n\n\ndef fix(client, take):\n    return onlyhere.UNSEEN\n")
    env = environment(cluster.marker, PYTHONPATH=str(tmp_path))
    out = tmp_path / "out.jsonl"
    done = subprocess.run([sys.executable, "-m", "Client3.batch", "needy:fix", *takes, "--cluster", cluster.address,
                           "--out", str(out)], cwd=str(user), env=env, capture_output=True, text=True, timeout=WAIT * 2)
    worker = r"worker tcp://127\.0\.0\.1:\d+"
    assert (done.returncode, done.stdout) == (1, "")
    assert re.fullmatch(f"python -m Client3.batch: the Dask cluster at {re.escape(cluster.address)} cannot run the job "
                        f"needy:fix: {worker}, {worker} cannot load the job \\(ModuleNotFoundError: No module named "
                        f"'onlyhere'\\)\n", done.stderr), done.stderr
    assert out.read_text() == ""  # no take ran


def test_a_scheduler_without_client3_stops_the_batch_before_its_first_take(user, takes, tmp_path):
    # A Client3 that cannot be imported, first on the scheduler's path: as if it were not installed.
    (tmp_path / "shadow" / "Client3").mkdir(parents=True)
    (tmp_path / "shadow" / "Client3" / "__init__.py").write_text("raise ImportError('not installed here')\n")
    lone = Deployed(str(tmp_path), workers=0, pythonpath=str(tmp_path / "shadow"))
    try:
        status, results, errors = run_script(user, takes, lone)
    finally:
        assert lone.stop() == []
    assert (status, results) == (1, {})
    assert errors.endswith(f"ClusterError: the Dask cluster at {lone.address} cannot run the job __main__:in_script: the "
                           "scheduler cannot load Client3's batch tasks (ImportError: not installed here)\n"), errors


def test_a_job_that_cannot_be_pickled_stops_before_its_first_take(takes, cluster):
    lock = threading.Lock()
    with pytest.raises(batch.ClusterError) as caught:
        next(batch.run(lambda client, take: lock, takes, cluster=cluster.address))
    assert str(caught.value) == ("the job test_batch:test_a_job_that_cannot_be_pickled_stops_before_its_first_take."
                                 "<locals>.<lambda> cannot be sent to a cluster: TypeError: cannot pickle '_thread.lock' object")
