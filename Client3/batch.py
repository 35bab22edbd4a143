"""Batch processing: one job over many takes, on this machine's cores or on a Dask cluster.

    import Client3.batch

    def fix(client, take):                      # importable: workers find it by module and name
        client.OfflineFixOcclusion("", "").check()
        return client.GetFrameCount()

    for result in Client3.batch.run(fix, ["a.scene", "b.c3d"], workers=2, out="results.jsonl"):
        print(result.take, result.ok, result.value)

Each worker process starts one application on loopback the first time it needs one and keeps it for
the takes that follow; every take is opened into a fresh scene (scene files with LoadFile, .csv and
.c3d files with ImportFile) before `job(client, take)` runs. Results come in the order takes finish.
An application that ends during a take is started again and the take run again, up to `retries`
times. With `out`, each result is appended to that file as one JSON line the moment it arrives, and
`resume=True` skips the takes the file already holds.

    python -m Client3.batch JOB TAKE... [--workers N] [--cluster ADDRESS] [--out FILE] [--resume] [--retries N]

runs the same from the command line (JOB as `module:function`).
"""
from __future__ import annotations

import argparse
import atexit
import importlib
import json
import multiprocessing
import multiprocessing.util
import os
import signal
import subprocess
import sys
import tempfile
import threading
import time
from concurrent.futures import FIRST_COMPLETED, Future, ProcessPoolExecutor, wait
from concurrent.futures.process import BrokenProcessPool
from typing import Any, Callable, Dict, Iterable, Iterator, List, NamedTuple, Optional, Sequence, Set, Tuple

import Client3
from Client3.host import executable, listening_port, stop

Job = Callable[[Any, str], Any]
IMPORTED = (".csv", ".c3d")  # opened with ImportFile; anything else is a scene file for LoadFile


class ClusterError(RuntimeError):
    """A Dask cluster that cannot run the batch's job: raised before the first take, naming what the
    scheduler or the workers lack."""


class Result(NamedTuple):
    """What became of one take."""

    take: str
    ok: bool
    value: Any  # the job's return value, or the error text
    seconds: float  # from opening the take to the job's end, retries included
    worker: str  # the worker that ran it
    attempts: int = 1  # more than one when the application ended during the take and it was run again


# --- in the worker processes ------------------------------------------------------------------------


class _Application:
    """One application and a client connected to it, kept by a worker for take after take."""

    def __init__(self, options: Tuple[str, ...]) -> None:
        self.options = options
        # Its own session, so that a terminal's Ctrl-C reaches the workers and not their applications
        # (the worker stops it); --watch-stdin takes it down with the worker however the worker ends.
        self.process = subprocess.Popen(
            [executable(), "--port", "0", "--scene", "empty", "--watch-stdin", *options],
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, stderr=subprocess.DEVNULL, text=True,
            **_own_session())
        assert self.process.stdout is not None
        try:
            self.client = Client3.connect("127.0.0.1", listening_port(self.process.stdout.readline()))
        except BaseException:
            stop(self.process)
            raise
        _started.append(self)

    def run(self, job: Job, take: str, path: str) -> Tuple[bool, Any, bool]:
        """(ok, the job's value or the error text, whether the application was lost meanwhile)."""
        try:
            if path.lower().endswith(IMPORTED):
                self.client.ImportFile(path, "", False).check()
            else:
                self.client.LoadFile(path).check()
            ok, value = True, job(self.client, take)
        except Exception as error:  # the job's own failures are results, not the worker's
            ok, value = False, str(error) if isinstance(error, Client3.Error) else f"{type(error).__name__}: {error}"
        return ok, value, not self.alive()

    def alive(self) -> bool:
        return self.process.poll() is None and bool(self.client.IsConnected())

    def stop(self) -> None:
        if self in _started:
            _started.remove(self)
        self.client.Disconnect()
        if self.process.stdin is not None:
            self.process.stdin.close()
        stop(self.process)


def _own_session() -> Dict[str, Any]:
    if os.name == "nt":
        return {"creationflags": subprocess.CREATE_NEW_PROCESS_GROUP}  # type: ignore[attr-defined]
    return {"start_new_session": True}


_started: List[_Application] = []  # every application of this process
_idle: List[_Application] = []  # those no take is using
_lock = threading.Lock()
_busy = 0  # takes running in this process; Ctrl-C interrupts only those


def _take_application(options: Tuple[str, ...]) -> _Application:
    with _lock:
        for application in _idle:
            if application.options == options:
                _idle.remove(application)
                return application
        if not _started:  # the first one: stop them all when the process ends
            multiprocessing.util.Finalize(None, stop_applications, exitpriority=10)
            atexit.register(stop_applications)
    return _Application(options)


def stop_applications() -> None:
    """Stops every application this process started (at its end, or when a Dask worker closes)."""
    with _lock:
        _idle.clear()
        started = list(_started)
    for application in started:
        application.stop()


def run_take(job: Job, take: str, path: str, retries: int, options: Tuple[str, ...], worker: str = "",
             mark: str = "") -> Result:
    """Runs one take on one of this process's applications: the unit of work of both engines. The
    file `mark`, when given, exists while the take runs."""
    global _busy
    began = time.perf_counter()
    attempts = 0
    _busy += 1
    if mark:
        open(mark, "wb").close()
    try:
        while True:
            attempts += 1
            try:
                application = _take_application(options)
            except Exception as error:  # not installed, or it refused its options
                ok, value = False, f"cannot start the application: {error}"
                break
            ok, value, lost = application.run(job, take, path)
            if not lost:
                with _lock:
                    _idle.append(application)
                break
            application.stop()
            if attempts > retries:
                ok, value = False, f"the application ended during the take: {value if not ok else 'no error seen'}"
                break
    finally:
        _busy -= 1
        if mark:
            os.remove(mark)
    return Result(take, ok, value, time.perf_counter() - began, worker or f"process {os.getpid()}", attempts)


def _interrupt(signum: int, frame: Any) -> None:
    if _busy:
        raise KeyboardInterrupt


def _worker_start() -> None:
    # Ctrl-C at a terminal reaches every process of its group: a worker gives up the take it runs and
    # then waits to be told to end; an idle one just waits.
    signal.signal(signal.SIGINT, _interrupt)


# --- in the calling process -------------------------------------------------------------------------


def _pool_results(job: Job, takes: Sequence[Tuple[str, str]], workers: int, retries: int,
                  options: Tuple[str, ...]) -> Iterator[Result]:
    """The standard library's process pool. A worker process that ends abruptly breaks the pool, and
    every take then running (their mark files are left) ends with it; the unfinished takes go to a
    new pool. When one take was running, its end counts as an attempt, at most `retries` more times.
    When several were, which of them ended its process is not known: each is run again by itself,
    before the others, so that no take is charged for another's end."""
    attempts: Dict[str, int] = {}
    todo = list(takes)
    alone: List[Tuple[str, str]] = []  # run one at a time
    marks = tempfile.TemporaryDirectory(prefix="client3-batch-")
    with marks:
        while todo or alone:
            by_itself = bool(alone)
            round_takes, round_workers = (alone, 1) if by_itself else (todo, workers)
            pool = ProcessPoolExecutor(round_workers, mp_context=multiprocessing.get_context("spawn"),
                                       initializer=_worker_start)
            pending: Dict[Future, Tuple[str, str, str]] = {}  # type: ignore[type-arg]
            for index, (take, path) in enumerate(round_takes):
                mark = os.path.join(marks.name, str(index))
                pending[pool.submit(run_take, job, take, path, retries, options, "", mark)] = (take, path, mark)
            unfinished: List[Tuple[str, str]] = []
            running: List[Tuple[str, str]] = []
            try:
                while pending:
                    finished, _ = wait(pending, return_when=FIRST_COMPLETED)
                    for future in finished:
                        take, path, mark = pending.pop(future)
                        try:
                            yield future.result()
                        except BrokenProcessPool:
                            if os.path.exists(mark):
                                os.remove(mark)
                                running.append((take, path))
                            else:
                                unfinished.append((take, path))
            finally:
                for future in pending:
                    future.cancel()
                pool.shutdown(wait=True)
            todo, alone = (todo, unfinished) if by_itself else (unfinished, [])
            if len(running) == 1:
                take, path = running[0]
                attempts[take] = attempts.get(take, 0) + 1
                if attempts[take] > retries:
                    yield Result(take, False, "the worker process ended during the take", 0.0, "", attempts[take])
                    continue
            alone[:0] = running


def _done(out: str) -> Set[str]:
    """The takes already in a results file, which is cut back to its last whole line (an interrupted
    write can leave a part of one)."""
    if not os.path.exists(out):
        return set()
    with open(out, "rb+") as file:
        data = file.read()
        whole = data[: data.rfind(b"\n") + 1]
        if len(whole) < len(data):
            file.truncate(len(whole))
    return {json.loads(line)["take"] for line in whole.splitlines() if line.strip()}


def run(job: Job, takes: Iterable[str], *, workers: Optional[int] = None, cluster: Any = None,
        out: Optional[str] = None, resume: bool = False, retries: int = 1,
        host_options: Sequence[str] = ()) -> Iterator[Result]:
    """Runs `job(client, take)` on every take and yields one Result per take as each finishes.

    `workers` processes of the standard library's pool (default: the number of cores), or the Dask
    cluster `cluster` (a scheduler address or a distributed.Client) when it is given. `out` appends
    each result to a file as a JSON line; `resume` skips the takes already there (without it the
    file is started anew). A take is given once however often it is listed. `host_options` are
    passed to every application the workers start (client3-host's options, for example a --fault).
    A Dask cluster that cannot load the job raises ClusterError before the first take.
    """
    if retries < 0:
        raise ValueError("retries must be 0 or more")
    if workers is not None and workers < 1:
        raise ValueError("workers must be 1 or more")
    if resume and out is None:
        raise ValueError("resume needs the out file")
    done = _done(out) if out is not None and resume else set()
    todo = [(take, os.path.abspath(take)) for take in dict.fromkeys(takes) if take not in done]
    if out is not None and not resume:
        open(out, "wb").close()
    if not todo:
        return
    options = tuple(host_options)
    if cluster is not None:
        dask_engine = importlib.import_module("Client3._dask")  # loaded only when a cluster is given
        results = dask_engine.results(job, todo, cluster, retries, options)
    else:
        results = _pool_results(job, todo, min(workers or os.cpu_count() or 1, len(todo)), retries, options)
    fd = os.open(out, os.O_WRONLY | os.O_APPEND | os.O_CREAT, 0o666) if out is not None else -1
    try:
        for result in results:
            if fd >= 0:  # one write of a whole line, so that an interruption never leaves half of one
                os.write(fd, (json.dumps(result._asdict(), default=repr) + "\n").encode())
            yield result
    finally:
        if fd >= 0:
            os.close(fd)
        close = getattr(results, "close", None)
        if close is not None:
            close()


# --- the command line -------------------------------------------------------------------------------


class _Parser(argparse.ArgumentParser):
    def error(self, message: str) -> Any:  # one line, exit status 2
        self.exit(2, f"{self.prog}: {message}\n")


def load_job(text: str) -> Job:
    """The function named `module:function`; ValueError with a one-line reason when there is none."""
    module, _, name = text.partition(":")
    if not module or not name:
        raise ValueError(f"JOB must be written module:function, not {text!r}")
    try:
        found = getattr(importlib.import_module(module), name)
    except Exception as error:  # ImportError, AttributeError, or whatever importing the module raised
        raise ValueError(f"cannot import {text}: {type(error).__name__}: {error}") from None
    if not callable(found):
        raise ValueError(f"{text} is not a function")
    return found  # type: ignore[no-any-return]


def _progress(total: int) -> Any:
    if not sys.stderr.isatty():
        return None
    try:
        tqdm = importlib.import_module("tqdm")
    except ImportError:  # no bar without tqdm
        return None
    return tqdm.tqdm(total=total, unit="take", file=sys.stderr)


def main(argv: Optional[List[str]] = None) -> int:
    parser = _Parser(prog="python -m Client3.batch", description="Runs JOB(client, take) over every TAKE.")
    parser.add_argument("job", metavar="JOB", help="the job, as module:function")
    parser.add_argument("takes", metavar="TAKE", nargs="*", help="scene, CSV or C3D files")
    parser.add_argument("--workers", type=int, help="worker processes (default: the number of cores)")
    parser.add_argument("--cluster", metavar="ADDRESS", help="a Dask scheduler's address")
    parser.add_argument("--out", metavar="FILE", help="write each result to FILE as a JSON line as its take ends; without --resume, FILE is started anew")
    parser.add_argument("--resume", action="store_true", help="skip the takes already in FILE")
    parser.add_argument("--retries", type=int, default=1, help="runs again after the application ended (default 1)")
    arguments = parser.parse_args(argv)
    if not arguments.takes:
        parser.error("no takes given")
    if arguments.workers is not None and arguments.workers < 1:
        parser.error("--workers takes a number of 1 or more")
    if arguments.retries < 0:
        parser.error("--retries takes a number of 0 or more")
    if arguments.resume and not arguments.out:
        parser.error("--resume needs --out")
    sys.path.insert(0, os.getcwd())  # as `python -m` finds modules, so does JOB
    try:
        job = load_job(arguments.job)
    except ValueError as error:
        parser.error(str(error))
    takes = list(dict.fromkeys(arguments.takes))
    skipped = len(_done(arguments.out) & set(takes)) if arguments.resume else 0
    counts = {"done": 0, "failed": 0, "retried": 0}
    bar = _progress(len(takes) - skipped)
    # Run as `python -m Client3.batch` this module is __main__, and the engines raise Client3.batch's.
    cluster_error = importlib.import_module("Client3.batch").ClusterError
    began = time.perf_counter()
    interrupted = False
    try:
        for result in run(job, takes, workers=arguments.workers, cluster=arguments.cluster,
                          out=arguments.out, resume=arguments.resume, retries=arguments.retries):
            counts["done" if result.ok else "failed"] += 1
            counts["retried"] += result.attempts > 1
            if not result.ok:
                (bar.write if bar else print)(f"failed: {result.take}: {result.value}", file=sys.stderr)
            if bar:
                bar.update()
    except KeyboardInterrupt:
        interrupted = True
    except cluster_error as error:  # before the first take: no summary
        print(f"{parser.prog}: {error}", file=sys.stderr)
        return 1
    finally:
        if bar:
            bar.close()
    seconds = time.perf_counter() - began
    finished = counts["done"] + counts["failed"]
    print(f"done {counts['done']}, failed {counts['failed']}, retried {counts['retried']}, skipped {skipped}, "
          f"wall time {seconds:.2f} s, {finished / seconds if seconds else 0.0:.2f} takes per second"
          + (" (interrupted)" if interrupted else ""))
    return 130 if interrupted else 1 if counts["failed"] else 0


if __name__ == "__main__":
    sys.exit(main())
