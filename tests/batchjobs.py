"""Jobs for the batch tests, importable by name as the pool's workers need them, the takes they run
on, and what the tests check them against: the job run serially, and the processes a batch left."""
import os
import time

SUBJECTS = ("Alice", "Bob")
NOT_A_FUNCTION = 42
MARKER = "CLIENT3_BATCH_TEST"  # in the environment of the processes a test starts, with a value of its own


def unseen(client):
    """Frames not seen, summed over every marker of the demo's subjects."""
    total = 0
    for subject in SUBJECTS:
        for marker in client.GetMarkerNames(subject).check().Names:
            total += list(client.GetTrajectory(subject, str(marker)).check().E).count(False)
    return total


def fix(client, take):
    """Fills the gaps: the frames unseen before and after."""
    before = unseen(client)
    client.OfflineFixOcclusion("", "").check()
    return [before, unseen(client)]


def fail_marked(client, take):
    """Fails on the takes whose name has 'bad' in it, and fixes the others."""
    if "bad" in os.path.basename(take):
        raise ValueError(f"refusing {os.path.basename(take)}")
    return fix(client, take)


def exit_marked(client, take):
    """Ends its worker process on the spot on the takes whose name has 'bad' in it, as soon as
    another take of its folder is running (or after 20 s); the others say they run, then take a
    while."""
    running = os.path.join(os.path.dirname(take), "running")
    if "bad" in os.path.basename(take):
        deadline = time.monotonic() + 20
        while not os.path.exists(running) and time.monotonic() < deadline:
            time.sleep(0.01)
        os._exit(1)
    open(running, "wb").close()
    time.sleep(0.5)
    return fix(client, take)


def slow(client, take):
    """Takes a while: long enough to be interrupted."""
    time.sleep(1)
    return fix(client, take)


def make_takes(folder, count, frames):
    """`count` demo takes of `frames` frames saved in `folder`, the i-th with a gap of 5 + 3i frames cut
    into Alice's LANK, the last one exported as CSV; their paths."""
    import Client3
    from Client3.testing import running_host

    base = os.path.join(folder, "base.scene")
    paths = []
    with running_host(frames=frames, log=False) as host, Client3.connect(host.address, host.port) as client:
        client.SaveFile(base, "").check()
        for index in range(count):
            client.LoadFile(base).check()
            trajectory = client.GetTrajectory("Alice", "LANK").check()
            seen = list(trajectory.E)
            seen[20:25 + 3 * index] = [False] * (5 + 3 * index)
            client.SetTrajectory("Alice", "LANK", trajectory.X, trajectory.Y, trajectory.Z, seen).check()
            paths.append(os.path.join(folder, f"take{index}.scene"))
            client.SaveFile(paths[-1], "").check()
        paths[-1] = paths[-1].replace(".scene", ".csv")
        client.ExportFile(paths[-1], "").check()
    return paths


def run_serially(takes):
    """The value of `fix` for each take, run one after the other on one application."""
    import Client3
    from Client3.testing import running_host

    values = {}
    with running_host(scene="empty", log=False) as host, Client3.connect(host.address, host.port) as client:
        for take in takes:
            if take.endswith(".csv"):
                client.ImportFile(take, "", False).check()
            else:
                client.LoadFile(take).check()
            values[take] = fix(client, take)
    return values


def marked_processes(marker, program=""):
    """The live processes whose environment carries `marker` as MARKER (what was started under it),
    those of `program` alone when it is given."""
    import psutil

    found = []
    for process in psutil.process_iter():
        try:
            if process.environ().get(MARKER) == marker and process.name().startswith(program):
                found.append(process)
        except (psutil.Error, OSError):
            continue
    return found
