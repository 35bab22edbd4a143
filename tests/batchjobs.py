"""Jobs for the batch tests: importable by name, as the workers need them."""
import os
import time

SUBJECTS = ("Alice", "Bob")
NOT_A_FUNCTION = 42


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
