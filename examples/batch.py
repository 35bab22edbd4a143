"""Batch processing: 20 takes, each with gaps filled and its trajectories filtered, two at a time.

    python examples/batch.py                          # makes the takes in a temporary folder
    python examples/batch.py FOLDER                   # makes them in FOLDER and leaves them there
    python examples/batch.py --cluster tcp://HOST:8786 FOLDER    # on a Dask cluster

The takes are the demo scene with a gap of its own cut into one marker each, saved as scene files.
Each of the two worker processes starts an application of its own and runs `process` on the takes
it is given; the table lists the gaps of every take before, filled, and left.

With `--cluster`, the takes run on the workers of a Dask scheduler started apart (`dask scheduler`,
`dask worker`), which need Client3 but not this script: the job defined here is sent to them. Workers
on other machines open the takes by the paths this script gives, so FOLDER must be a shared folder
that every machine sees at the same path.
"""
from __future__ import annotations

import argparse
import os
import sys
import tempfile
import time
from typing import Dict, List, Optional, Tuple

import Client3
import Client3.batch
from Client3.testing import running_host

TAKES = 20
WORKERS = 2
MARKERS = ("LANK", "RANK", "LFHD", "RKNE", "LWRA")


def make_takes(folder: str) -> List[str]:
    """The demo take saved TAKES times, the i-th (from 1) with a gap of 4i frames cut into one of Bob's
    markers at frame 601: the gaps longer than the default 0.5 s (50 frames) stay unfilled."""
    paths = []
    with running_host(log=False) as host, Client3.connect(host.address, host.port) as client:
        demo = os.path.join(folder, "demo.scene")
        client.SaveFile(demo, "").check()
        for index in range(TAKES):
            client.LoadFile(demo).check()
            marker = MARKERS[index % len(MARKERS)]
            trajectory = client.GetTrajectory("Bob", marker).check()
            seen = list(trajectory.E)
            seen[600:604 + 4 * index] = [False] * (4 + 4 * index)
            client.SetTrajectory("Bob", marker, trajectory.X, trajectory.Y, trajectory.Z, seen).check()
            paths.append(os.path.join(folder, f"take{index + 1:02}.scene"))
            client.SaveFile(paths[-1], "").check()
    return paths


def gaps(client: Client3.ZarvoPelluxPostClient) -> int:
    """Runs of unseen frames with seen frames on both sides, over every marker of every subject."""
    count = 0
    for subject in client.GetSubjectNames().check().Names:
        for marker in client.GetMarkerNames(subject).check().Names:
            seen = "".join("1" if e else "0" for e in client.GetTrajectory(subject, marker).check().E)
            count += len([run for run in seen.strip("0").split("1") if run])
    return count


def process(client: Client3.ZarvoPelluxPostClient, take: str) -> Tuple[int, int]:
    """The job: fills the gaps, then low-passes every marker at 6 Hz; (gaps before, gaps after)."""
    before = gaps(client)
    client.OfflineFixOcclusion("", "").check()
    for subject in client.GetSubjectNames().check().Names:
        for marker in client.GetMarkerNames(subject).check().Names:
            node = client.SceneGetObject(f"/{subject}/{marker}").check().ID
            x = int(client.ObjectGetChannel(node, "X").check().Str)
            client.FilterApplyFIR(node, x, "XYZ", False, 31, 6.0, 0.0, 2.0).check()
    return before, gaps(client)


def main(folder: str, cluster: Optional[str]) -> None:
    takes = make_takes(folder)
    began = time.perf_counter()
    rows: Dict[str, Tuple[int, int]] = {}
    for result in Client3.batch.run(process, takes, workers=WORKERS, cluster=cluster):
        if not result.ok:
            sys.exit(f"{result.take}: {result.value}")
        rows[os.path.basename(result.take)] = result.value
    seconds = time.perf_counter() - began
    print(f"{'take':<14}{'gaps':>6}{'filled':>8}{'left':>6}")
    for name, (before, after) in sorted(rows.items()):
        print(f"{name:<14}{before:>6}{before - after:>8}{after:>6}")
    print(f"{len(rows)} takes in {seconds:.1f} s " + (f"on {cluster}" if cluster else f"with {WORKERS} workers"))


if __name__ == "__main__":  # the workers import this file too: only the main process runs the batch
    parser = argparse.ArgumentParser(description="Fills and filters 20 takes in a batch.")
    parser.add_argument("folder", nargs="?", help="where the takes are made (default: a temporary folder)")
    parser.add_argument("--cluster", metavar="ADDRESS", help="a Dask scheduler's address")
    arguments = parser.parse_args()
    if arguments.folder:
        os.makedirs(arguments.folder, exist_ok=True)
        main(arguments.folder, arguments.cluster)
    else:
        with tempfile.TemporaryDirectory() as temporary:
            main(temporary, arguments.cluster)
