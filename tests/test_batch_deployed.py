"""Client3.batch on a Dask cluster deployed as Dask is deployed: a scheduler and workers started as
processes of their own (on loopback), which have Client3 but not the user's folder. A job defined in
the user's script or in a module beside it runs on them; a job that needs what the workers lack
stops before its first take with one message naming it."""
import contextlib
import json
import os
import re
import shutil
import subprocess
import sys
import threading
import time
import uuid

import psutil
import pytest

import Client3
import Client3.batch
import batchjobs
import companion

distributed = pytest.importorskip("distributed")

WAIT = 60  # seconds a process may take to start or stop
TAKES = 4

# The batch as a user's script runs it: `python script.py ADDRESS TAKE...`, one JSON line per take.
SCRIPT = '''
import json
import sys

import Client3.batch
import steps


def in_script(client, take):
    return steps.fix(client, take)


if __name__ == "__main__":
    job = {"module": steps.fix, "script": in_script}[sys.argv[1]]
    for result in Client3.batch.run(job, sys.argv[3:], cluster=sys.argv[2]):
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
                self._start([sys.executable, "-m", "dask", "scheduler", "--host", "127.0.0.1", "--port", "0",
                             "--no-dashboard", "--scheduler-file", where], start)
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
    and demo takes. Nothing else has it on a path."""
    folder = tmp_path_factory.mktemp("user")
    shutil.copy(batchjobs.__file__, folder / "steps.py")
    (folder / "script.py").write_text(SCRIPT)
    batchjobs.make_takes(str(folder), TAKES, 200)
    return folder


@pytest.fixture(scope="module")
def serial(user):
    """The job's value for each take, run here one take after the other."""
    return batchjobs.run_serially(takes_of(user))


@pytest.fixture(scope="module")
def cluster(tmp_path_factory):
    deployed = Deployed(str(tmp_path_factory.mktemp("cluster")), workers=2)
    yield deployed
    assert deployed.stop() == [], "processes left running"


def takes_of(user):
    return [str(user / f"take{index}.scene") for index in range(TAKES)]


def run_batch(user, cluster, how, env=None):
    """Runs the batch as the user would, from another folder; its exit status, results and errors."""
    if how == "command line":  # from the user's folder, as `python -m` finds modules there
        command, cwd = [sys.executable, "-m", "Client3.batch", "steps:fix", *takes_of(user), "--cluster", cluster.address,
                        "--out", str(user / "out.jsonl")], str(user)
    else:
        command, cwd = [sys.executable, str(user / "script.py"), how, cluster.address, *takes_of(user)], str(user.parent)
    done = subprocess.run(command, cwd=cwd, env=env or environment(cluster.marker), capture_output=True, text=True,
                          timeout=WAIT * 2)
    if how == "command line":
        lines = (user / "out.jsonl").read_text().splitlines() if (user / "out.jsonl").exists() else []
        results = [(line["take"], line["ok"], line["value"]) for line in map(json.loads, lines)]
    else:
        results = [tuple(json.loads(line)) for line in done.stdout.splitlines()]
    return done.returncode, {take: (ok, value) for take, ok, value in results}, done.stderr


@pytest.mark.parametrize("how", ["module", "script", "command line"])
def test_a_job_from_the_users_folder_runs_on_workers_that_lack_it(user, serial, cluster, how):
    status, results, errors = run_batch(user, cluster, how)
    assert status == 0, errors
    assert results == {take: (True, value) for take, value in serial.items()}


def test_a_job_that_needs_a_module_the_workers_lack_stops_before_its_first_take(user, cluster, tmp_path):
    # The job's module imports one that only this machine has, on a path outside the user's folder.
    (tmp_path / "onlyhere.py").write_text("UNSEEN = 'unseen'\n")
    (user / "needy.py").write_text("import onlyhere\n\n\ndef fix(client, take):\n    return onlyhere.UNSEEN\n")
    env = environment(cluster.marker, PYTHONPATH=str(tmp_path))
    out = tmp_path / "out.jsonl"
    done = subprocess.run([sys.executable, "-m", "Client3.batch", "needy:fix", *takes_of(user), "--cluster", cluster.address,
                           "--out", str(out)], cwd=str(user), env=env, capture_output=True, text=True, timeout=WAIT * 2)
    worker = r"worker tcp://127\.0\.0\.1:\d+"
    assert (done.returncode, done.stdout) == (1, "")
    assert re.fullmatch(f"python -m Client3.batch: the Dask cluster at {re.escape(cluster.address)} cannot run the job "
                        f"needy:fix: {worker}, {worker} cannot load the job \\(ModuleNotFoundError: No module named "
                        f"'onlyhere'\\)\n", done.stderr), done.stderr
    assert out.read_text() == ""  # no take ran


def test_a_scheduler_without_client3_stops_the_batch_before_its_first_take(user, tmp_path):
    # A Client3 that cannot be imported, first on the scheduler's path: as if it were not installed.
    (tmp_path / "shadow" / "Client3").mkdir(parents=True)
    (tmp_path / "shadow" / "Client3" / "__init__.py").write_text("raise ImportError('not installed here')\n")
    lone = Deployed(str(tmp_path), workers=0, pythonpath=str(tmp_path / "shadow"))
    try:
        status, results, errors = run_batch(user, lone, "module")
    finally:
        assert lone.stop() == []
    assert (status, results) == (1, {})
    assert errors.endswith(f"Client3.batch.ClusterError: the Dask cluster at {lone.address} cannot run the job steps:fix: the "
                           "scheduler cannot load Client3's batch tasks (ImportError: not installed here)\n"), errors


def test_a_job_that_cannot_be_pickled_stops_before_its_first_take(user, cluster):
    lock = threading.Lock()
    with pytest.raises(Client3.batch.ClusterError) as caught:
        next(Client3.batch.run(lambda client, take: lock, takes_of(user), cluster=cluster.address))
    assert str(caught.value) == ("the job test_batch_deployed:test_a_job_that_cannot_be_pickled_stops_before_its_first_take."
                                 "<locals>.<lambda> cannot be sent to a cluster: TypeError: cannot pickle '_thread.lock' object")
