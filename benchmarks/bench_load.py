"""Many clients at once against one client3-host: every write kept, latency percentiles, host memory.

    python benchmarks/bench_load.py               # 32 clients x 10,000 calls
    python benchmarks/bench_load.py --quick       # 4 clients x 200 calls: only checks that it runs
    python benchmarks/bench_load.py --clients 8 --calls 1000

Each client is a process of its own, connected before any starts, and makes a seeded mix of calls on the
demo take: it writes frames of its own (frame f of every marker belongs to client (f - 1) % clients) with
SetTrajectoryAtFrame, reads single frames of everyone's, whole trajectories, the frame count and the
subject and marker names. Every value a client writes says who wrote it and when (X = client * 10^6 + n,
Y = the cell's own number, Z = n), so a read that shows a value torn or in the wrong place is seen, and a
client always reads back its own last write. Afterwards one more client reads the whole take: every
client's last write to each of its cells must be there. Every wait has a time limit and every process
started here is stopped before the benchmark ends; the exit status is 1 when a write was lost or a read
was wrong.
"""
import argparse
import json
import os
import random
import subprocess
import sys
import shutil
import sysconfig
import tempfile
import time

import _Client3 as m

from bench_client import register_classes, start, stop

FRAMES = 1000
SUBJECTS = ("Alice", "Bob")
MARKERS = "LFHD RFHD C7 STRN LASI RASI LWRA RWRA LKNE RKNE LANK RANK".split()
CELLS = [(s, k) for s in SUBJECTS for k in MARKERS]  # (subject, marker); a cell is one of these at one frame
WAIT = 600  # seconds any one step may take before the benchmark gives up
# The mix of calls, as weights.
MIX = {"write": 35, "read": 35, "trajectory": 10, "count": 10, "markers": 5, "subjects": 5}


def cell_number(marker, frame):
    """A number of its own for each cell, far from any coordinate of the demo take."""
    return (marker + 1) * 10_000 + frame


def ok(record, what):
    code = m.Output_Result_Result_get(record)
    if code != m.Success:
        raise RuntimeError(f"{what} failed ({code}): {m.SafeString_Value(m.Output_Result_ResultString_get(record))}")
    return record


def at_frame(client, marker, frame):
    subject, name = CELLS[marker]
    record = ok(m.ZarvoPelluxPostClient_GetTrajectoryAtFrame(client, subject, name, frame), "GetTrajectoryAtFrame")
    return tuple(getattr(m, f"Output_GetTrajectoryAtFrame_{axis}_get")(record) for axis in "XYZ")


def worker(port, me, clients, calls, seed, out):
    """One client's calls, after a "go" line on standard input; writes its figures as JSON to `out`."""
    register_classes()
    rng = random.Random(seed * 1000 + me)
    client = m.new_ZarvoPelluxPostClient()
    ok(m.ZarvoPelluxPostClient_Connect(client, "127.0.0.1?timeout=60000", port), "Connect")
    mine = [f for f in range(1, FRAMES + 1) if (f - 1) % clients == me]
    last = {}      # (marker, frame) -> n of this client's last write there
    wrong = []     # reads that show what no client wrote there
    latencies = {kind: [] for kind in MIX}
    kinds = rng.choices(list(MIX), weights=list(MIX.values()), k=calls)
    print("ready", flush=True)
    sys.stdin.readline()
    clock = time.perf_counter_ns
    for n, kind in enumerate(kinds, 1):
        marker = rng.randrange(len(CELLS))
        subject, name = CELLS[marker]
        started = clock()
        if kind == "write":
            frame = rng.choice(mine)
            ok(m.ZarvoPelluxPostClient_SetTrajectoryAtFrame(client, subject, name, frame, me * 1e6 + n,
                                                            float(cell_number(marker, frame)), float(n), True), "write")
            last[marker, frame] = n
        elif kind == "read":
            frame = rng.randrange(1, FRAMES + 1)
            x, y, z = at_frame(client, marker, frame)
            owner = (frame - 1) % clients
            if y == cell_number(marker, frame) and x != owner * 1e6 + z:
                wrong.append(f"{name} of {subject} at {frame}: {(x, y, z)}, which its owner {owner} never wrote")
            elif y != cell_number(marker, frame) and y >= 10_000 and y.is_integer():
                wrong.append(f"{name} of {subject} at {frame}: {(x, y, z)}, a value written to another cell")
            elif owner == me and (marker, frame) in last and z != last[marker, frame]:
                wrong.append(f"{name} of {subject} at {frame}: {z}, not this client's last write {last[marker, frame]}")
        elif kind == "trajectory":
            ok(m.ZarvoPelluxPostClient_GetTrajectory(client, subject, name), "GetTrajectory")
        elif kind == "count":
            if m.ZarvoPelluxPostClient_GetFrameCount(client) != FRAMES:
                wrong.append("GetFrameCount is not the take's length")
        elif kind == "markers":
            ok(m.ZarvoPelluxPostClient_GetMarkerNames(client, subject), "GetMarkerNames")
        else:
            ok(m.ZarvoPelluxPostClient_GetSubjectNames(client), "GetSubjectNames")
        latencies[kind].append((clock() - started) // 1000)
    m.delete_ZarvoPelluxPostClient(client)
    with open(out, "w") as file:
        json.dump({"latencies": latencies, "last": [[k[0], k[1], v] for k, v in last.items()], "wrong": wrong}, file)


def host_status(pid):
    """The host's resident memory in KiB and its thread count (None where /proc is missing)."""
    try:
        with open(f"/proc/{pid}/status") as status:
            fields = dict(line.split(":", 1) for line in status)
        return int(fields["VmRSS"].split()[0]), int(fields["Threads"])
    except OSError:
        return None


def lost_writes(port, outcomes, clients):
    """The last writes of every client that the take no longer holds."""
    client = m.new_ZarvoPelluxPostClient()
    try:
        ok(m.ZarvoPelluxPostClient_Connect(client, "127.0.0.1", port), "Connect")
        take = {}
        for marker, (subject, name) in enumerate(CELLS):
            record = ok(m.ZarvoPelluxPostClient_GetTrajectory(client, subject, name), "GetTrajectory")
            x, z = (getattr(m, f"Output_GetTrajectory_{axis}_get")(record) for axis in "XZ")
            take[marker] = ([m.vectord___getitem__(x, i) for i in range(FRAMES)], [m.vectord___getitem__(z, i) for i in range(FRAMES)])
    finally:
        m.delete_ZarvoPelluxPostClient(client)
    lost = []
    for me, outcome in enumerate(outcomes):
        for marker, frame, n in outcome["last"]:
            x, z = take[marker][0][frame - 1], take[marker][1][frame - 1]
            if (x, z) != (me * 1e6 + n, n):
                lost.append(f"client {me}'s write {n} to {CELLS[marker]} at {frame}: found {(x, z)}")
    return lost


def run(port, pid, clients, calls, seed=1):
    """Runs the clients against the host at `port` (process `pid`); returns the figures."""
    before = host_status(pid)
    folder = tempfile.TemporaryDirectory(prefix="bench_load")
    outs = [os.path.join(folder.name, f"{me}.json") for me in range(clients)]
    workers = [subprocess.Popen([sys.executable, os.path.abspath(__file__), "--worker", str(port), str(me), str(clients),
                                 str(calls), str(seed), outs[me]], stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True)
               for me in range(clients)]
    try:
        for w in workers:
            if w.stdout.readline() != "ready\n":
                raise RuntimeError("a client did not connect")
        started = time.perf_counter()
        for w in workers:
            w.stdin.write("go\n")
            w.stdin.flush()
        peak = before
        while any(w.poll() is None for w in workers) and time.perf_counter() - started < WAIT:
            now = host_status(pid)
            if now and peak:
                peak = (max(peak[0], now[0]), max(peak[1], now[1]))
            time.sleep(0.2)
        seconds = time.perf_counter() - started
        outcomes = []
        for w, out in zip(workers, outs):
            w.communicate(timeout=WAIT)
            if w.returncode != 0:
                raise RuntimeError(f"a client failed with status {w.returncode}")
            with open(out) as file:
                outcomes.append(json.load(file))
    finally:
        for w in workers:
            if w.poll() is None:
                w.kill()
                w.wait(10)
        folder.cleanup()
    latencies = {kind: sorted(t for o in outcomes for t in o["latencies"][kind]) for kind in MIX}
    return {
        "clients": clients, "calls": sum(len(v) for v in latencies.values()), "seconds": seconds,
        "latencies": latencies, "all": sorted(t for v in latencies.values() for t in v),
        "writes": sum(len(o["last"]) for o in outcomes), "wrong": [w for o in outcomes for w in o["wrong"]],
        "lost": lost_writes(port, outcomes, clients),
        "rss_before": before and before[0], "rss_peak": peak and peak[0], "threads_peak": peak and peak[1],
        "rss_after": (host_status(pid) or (None,))[0],
    }


def percentile(values, p):
    return values[min(len(values) - 1, int(len(values) * p / 100))] if values else 0


def report(figures):
    print(f"{figures['clients']} clients, {figures['calls']:,} calls in {figures['seconds']:.1f} s: "
          f"{figures['calls'] / figures['seconds']:,.0f} calls/s")
    print(f"  {'latency, us':<14} {'calls':>8} {'p50':>8} {'p90':>8} {'p99':>8} {'p99.9':>8} {'max':>8}")
    for kind, values in [*figures["latencies"].items(), ("all", figures["all"])]:
        cells = " ".join(f"{percentile(values, p):8d}" for p in (50, 90, 99, 99.9, 100))
        print(f"  {kind:<14} {len(values):8d} {cells}")
    if figures["rss_before"] is not None:
        print(f"  host memory: {figures['rss_before'] / 1024:.1f} MiB before, {figures['rss_peak'] / 1024:.1f} MiB at most, "
              f"{figures['rss_after'] / 1024:.1f} MiB after; {figures['threads_peak']} threads at most")
    print(f"  cells written: {figures['writes']:,}; writes lost: {len(figures['lost'])}; wrong reads: {len(figures['wrong'])}")
    for problem in (figures["lost"] + figures["wrong"])[:10]:
        print("   ", problem)


def main(argv=None):
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--quick", action="store_true", help="4 clients x 200 calls, to check that the benchmark runs")
    parser.add_argument("--clients", type=int, default=32)
    parser.add_argument("--calls", type=int, default=10_000, help="calls of each client")
    parser.add_argument("--worker", nargs=6, help=argparse.SUPPRESS)
    options = parser.parse_args(argv)
    if options.worker:
        worker(*map(int, options.worker[:5]), options.worker[5])
        return 0
    clients, calls = (4, 200) if options.quick else (options.clients, options.calls)

    executable = shutil.which("client3-host", path=sysconfig.get_path("scripts")) or shutil.which("client3-host")
    if not executable:
        sys.exit("client3-host is not installed: install the package first (pip install .)")
    register_classes()
    host, port = start([executable, "--port", "0", "--frames", str(FRAMES), "--max-clients", str(clients + 8)])
    try:
        figures = run(port, host.pid, clients, calls)
    finally:
        stop(host)
    report(figures)
    return 1 if figures["lost"] or figures["wrong"] else 0


if __name__ == "__main__":
    sys.exit(main())
