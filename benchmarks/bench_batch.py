"""Client3.batch on its two engines: throughput with one and two workers, and the batch layer's own cost.

    python benchmarks/bench_batch.py            # 32 takes of 10,000 frames; 200 short takes; best of 3
    python benchmarks/bench_batch.py --quick    # a few small takes once: only checks that everything runs

1. Throughput: OfflineFixOcclusion over each of a set of 10,000-frame scene files (opening the take
   included), with 1 and 2 workers of the process pool and of a Dask LocalCluster of as many worker
   processes. Counted from the result by which every worker has ended a take to the last, so that
   starting the workers and their applications is left out.
2. The cost of the batch layer per take, with a job that does nothing over 100-frame takes on one
   worker writing its results file: opening the take (the median of the takes' own seconds, which
   cover opening and the empty job), and the rest (dispatch, gathering, writing the result line:
   the time between two results less the second take's own seconds, averaged).

Every process started here (workers, their applications, the clusters) is stopped before it ends.
"""
import argparse
import contextlib
import os
import statistics
import sys
import tempfile
import time

import distributed

import Client3
import Client3.batch
from Client3.testing import running_host

SPEEDUP_GOAL = 1.7
ENGINES = ("process pool", "Dask")


def fix(client, take):
    client.OfflineFixOcclusion("", "").check()


def nothing(client, take):
    return None


def make_takes(folder, count, frames):
    """`count` copies of the demo take of `frames` frames, as scene files."""
    paths = []
    with running_host(frames=frames, log=False) as host, Client3.connect(host.address, host.port) as client:
        for index in range(count):
            paths.append(os.path.join(folder, f"take{frames}-{index}.scene"))
            client.SaveFile(paths[-1], "").check()
    return paths


def timed(takes, job, out=None, **engine):
    """Runs a batch; (arrival times, results), every take required to succeed."""
    arrivals, results = [], []
    for result in Client3.batch.run(job, takes, out=out, **engine):
        arrivals.append(time.perf_counter())
        results.append(result)
        if not result.ok:
            sys.exit(f"{result.take}: {result.value}")
    return arrivals, results


def throughput(takes, count, **engine):
    """Takes per second once all `count` workers are at work: counted from the `count`th result on, as the
    workers' first takes end at different times (a worker and its application start when they can)."""
    arrivals, _ = timed(takes, fix, **engine)
    return (len(takes) - count) / (arrivals[-1] - arrivals[count - 1])


def layer_cost(takes, out, **engine):
    """(opening, the rest) in milliseconds per take."""
    arrivals, results = timed(takes, nothing, out=out, **engine)
    own = [result.seconds for result in results]
    rest = (arrivals[-1] - arrivals[0] - sum(own[1:])) / (len(own) - 1)
    return statistics.median(own) * 1e3, rest * 1e3


@contextlib.contextmanager
def engine(name, workers):
    """The run's keyword arguments for engine `name` with `workers` workers; a cluster is stopped after use."""
    if name == "process pool":
        yield {"workers": workers}
        return
    with distributed.LocalCluster(n_workers=workers, threads_per_worker=1, processes=True, host="127.0.0.1",
                                  dashboard_address="127.0.0.1:0") as cluster, distributed.Client(cluster) as client:
        yield {"cluster": client}


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n")[0])
    parser.add_argument("--quick", action="store_true", help="a few small takes once")
    quick = parser.parse_args().quick
    rounds = 1 if quick else 3
    with tempfile.TemporaryDirectory() as folder:
        long_takes = make_takes(folder, 4 if quick else 32, 1000 if quick else 10000)
        short_takes = make_takes(folder, 10 if quick else 200, 100)
        frames = "1,000" if quick else "10,000"
        print(f"OfflineFixOcclusion over {len(long_takes)} takes of {frames} frames (takes per second, best of {rounds}):")
        rates = {}
        # One engine at a time, so that a cluster's processes ending do not slow the other engine's runs.
        for name in ENGINES:
            for workers in (1, 2):
                with engine(name, workers) as arguments:
                    rates[name, workers] = max(throughput(long_takes, workers, **arguments) for _ in range(rounds))
        for name in ENGINES:
            one, two = rates[name, 1], rates[name, 2]
            print(f"  {name:<14}1 worker {one:8.1f}   2 workers {two:8.1f}   {two / one:5.2f}x")
        print(f"  goal: 2 workers at least {SPEEDUP_GOAL}x 1 worker (on a machine with 2 free cores)")
        print(f"The batch layer per take, {len(short_takes)} takes of 100 frames, an empty job, 1 worker (ms, best of {rounds}):")
        for name in ENGINES:
            with engine(name, 1) as arguments:
                costs = [layer_cost(short_takes, os.path.join(folder, "results.jsonl"), **arguments) for _ in range(rounds)]
            opening, rest = min(cost[0] for cost in costs), min(cost[1] for cost in costs)
            print(f"  {name:<14}opening {opening:7.2f}   the rest {rest:7.2f}")
        print("  goal: the rest at most 2 ms a take with the process pool and 10 ms with Dask")


if __name__ == "__main__":
    main()
