"""The Dask engine of Client3.batch (the optional extra `pip install 'client3[cluster]'`).

Every take is a task of its own. Each Dask worker process keeps its applications in Client3.batch's
per-process state for as long as it lives; a worker plugin stops them when the worker closes. When a
worker is lost, Dask runs its takes again on another worker.

The job travels inside its tasks pickled with cloudpickle, so that the scheduler never has to load
it. The modules of the job's own folder (the script's, for a job defined in it) that the workers
cannot import are pickled by value with it; before the first take every worker loads the job once,
and a cluster that cannot (a module the job imports is missing there, or Client3 itself) stops the
batch with one message that names what is missing where.
"""
from __future__ import annotations

import functools
import importlib.util
import os
import pickle
import sys
from typing import Any, Dict, Iterator, List, Optional, Sequence, Tuple

import cloudpickle  # type: ignore[import-untyped]  # it ships no type information
import distributed
from distributed.core import Status
from distributed.diagnostics.plugin import WorkerPlugin

from Client3 import batch


class Applications(WorkerPlugin):
    """Stops the applications of a worker when it closes."""

    name = "client3-batch-applications"

    def teardown(self, worker: Any) -> None:
        # Each batch registers the plugin again, which tears the one before down: the applications
        # (perhaps in use by another batch) are stopped only when the worker itself closes.
        if worker.status in (Status.closing, Status.closing_gracefully, Status.closed, Status.failed):
            batch.stop_applications()


# --- on the workers -----------------------------------------------------------------------------


_jobs: Dict[bytes, batch.Job] = {}


def _job(payload: bytes) -> batch.Job:
    """The job a batch sent, loaded once per worker process (its modules sent by value then keep their
    state from take to take, as imported ones do); the jobs of the last few batches are kept."""
    job = _jobs.get(payload)
    if job is None:
        if len(_jobs) >= 4:
            _jobs.clear()
        job = _jobs[payload] = pickle.loads(payload)
    return job


def _task(take: str, path: str, plan: Tuple[bytes, int, Tuple[str, ...]]) -> batch.Result:
    payload, retries, options = plan
    return batch.run_take(_job(payload), take, path, retries, options, distributed.get_worker().address)


def _unfindable(names: List[str]) -> List[str]:
    """The top-level modules among `names` that this process cannot import."""
    missing = []
    for name in names:
        try:
            found = importlib.util.find_spec(name) is not None
        except (ImportError, ValueError):
            found = False
        if not found:
            missing.append(name)
    return missing


def _described(error: BaseException) -> str:
    return f"{type(error).__name__}: {error}"


def _load_error(payload: bytes) -> Optional[str]:
    """Why this process cannot load the job, or None when it can."""
    try:
        _job(payload)
    except Exception as error:
        return _described(error)
    return None


# --- in the calling process ------------------------------------------------------------------------


def _name(job: Any) -> str:
    return f"{getattr(job, '__module__', '?')}:{getattr(job, '__qualname__', type(job).__qualname__)}"


def _own_modules(job: Any) -> List[str]:
    """The top-level modules, loaded here, of the folder the job comes from: the user's own code,
    which the cluster may not have. Only pure Python modules can travel by value."""
    while isinstance(job, functools.partial):
        job = job.func
    home = sys.modules.get(getattr(job, "__module__", None) or type(job).__module__)
    if home is not None and home.__name__ not in ("__main__", "__mp_main__"):
        home = sys.modules.get(home.__name__.partition(".")[0])
    where = getattr(home, "__file__", None)
    if not where:
        return []
    folder = os.path.dirname(os.path.abspath(where))
    if getattr(home, "__path__", None) is not None:  # a package: its folder's parent holds it
        folder = os.path.dirname(folder)
    own = []
    for name, module in list(sys.modules.items()):
        where = getattr(module, "__file__", None)
        if "." in name or name in ("__main__", "__mp_main__") or not where or not where.endswith(".py"):
            continue
        where = os.path.abspath(where)
        if getattr(module, "__path__", None) is not None:
            where = os.path.dirname(where)
        if os.path.dirname(where) == folder:
            own.append(name)
    return sorted(own)


def _shipped(client: distributed.Client, job: batch.Job) -> bytes:
    """The job pickled for the workers, with the modules of its folder that some worker cannot import
    pickled by value (all of them while no worker has joined)."""
    own = _own_modules(job)
    missing = set(own)
    if own:
        answers = client.run(_unfindable, own, on_error="return")
        if answers:
            missing = {name for answer in answers.values() if isinstance(answer, list) for name in answer}
    registered = set(cloudpickle.list_registry_pickle_by_value())
    added = [sys.modules[name] for name in sorted(missing) if name not in registered]
    for module in added:
        cloudpickle.register_pickle_by_value(module)
    try:
        return cloudpickle.dumps(job)  # type: ignore[no-any-return]
    except Exception as error:
        raise batch.ClusterError(f"the job {_name(job)} cannot be sent to a cluster: {_described(error)}") from None
    finally:
        for module in added:
            cloudpickle.unregister_pickle_by_value(module)


def _check(client: distributed.Client, job: batch.Job, payload: bytes) -> None:
    """Raises ClusterError naming what the scheduler or each worker lacks to run the job's tasks."""
    problems: Dict[str, List[str]] = {}
    try:
        client.run_on_scheduler(_unfindable, [])  # a function of Client3's, which the graph's tasks are too
    except Exception as error:
        problems.setdefault(f"cannot load Client3's batch tasks ({_described(error)})", []).append("the scheduler")
    for worker, answer in sorted(client.run(_load_error, payload, on_error="return").items()):
        if isinstance(answer, BaseException):
            problems.setdefault(f"cannot load Client3's batch tasks ({_described(answer)})", []).append(f"worker {worker}")
        elif answer is not None:
            problems.setdefault(f"cannot load the job ({answer})", []).append(f"worker {worker}")
    if problems:
        where = "; ".join(f"{', '.join(places)} {problem}" for problem, places in problems.items())
        raise batch.ClusterError(f"the Dask cluster at {client.scheduler.address} cannot run the job {_name(job)}: {where}")


def _register(client: distributed.Client) -> None:
    register = getattr(client, "register_plugin", None) or getattr(client, "register_worker_plugin")
    register(Applications(), name=Applications.name)


def results(job: batch.Job, todo: Sequence[Tuple[str, str]], cluster: Any, retries: int,
            options: Tuple[str, ...]) -> Iterator[batch.Result]:
    """The results of the takes in `todo` ((take, path) pairs) as their tasks finish on `cluster`, a
    scheduler's address or a distributed.Client."""
    own = not isinstance(cluster, distributed.Client)
    client = distributed.Client(cluster) if own else cluster
    try:
        payload = _shipped(client, job)
        _check(client, job, payload)
        _register(client)
        takes = [take for take, _ in todo]
        futures = client.map(_task, takes, [path for _, path in todo], plan=(payload, retries, options), pure=False)
        take_of = {future.key: take for future, take in zip(futures, takes)}
        try:
            # Each result is fetched as its task finishes. (Gathering them in the background, through
            # as_completed's with_results, was seen to wait for ever once every task had finished.)
            for future in distributed.as_completed(futures):
                try:
                    result = future.result()
                except Exception as error:  # the task itself failed: a worker lost too often, for one
                    result = batch.Result(take_of[future.key], False, f"{type(error).__name__}: {error}", 0.0, "")
                yield result
        finally:
            client.cancel(futures)
    finally:
        if own:
            client.close()
