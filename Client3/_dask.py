"""The Dask engine of Client3.batch (the optional extra `pip install 'client3[cluster]'`).

Every take is a task of its own. Each Dask worker process keeps its applications in Client3.batch's
per-process state for as long as it lives; a worker plugin stops them when the worker closes. When a
worker is lost, Dask runs its takes again on another worker.
"""
from __future__ import annotations

from typing import Any, Iterator, Sequence, Tuple

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


def _task(take: str, path: str, plan: Tuple[batch.Job, int, Tuple[str, ...]]) -> batch.Result:
    job, retries, options = plan
    return batch.run_take(job, take, path, retries, options, distributed.get_worker().address)


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
        _register(client)
        takes = [take for take, _ in todo]
        futures = client.map(_task, takes, [path for _, path in todo], plan=(job, retries, options), pure=False)
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
