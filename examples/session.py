"""A first session with the application: an account of the scene, then one marker's gaps filled and
its motion smoothed, plotted before and after.

    python examples/session.py                  # starts its own application on a free port
    python examples/session.py HOST PORT        # uses a running one
    python examples/session.py --plot out.png --subject Bob --marker LKNE

The plot (session.png by default) shows the marker's x, y and z over time with its gaps shaded, as
captured and after OfflineFixOcclusion (gaps of up to one second) and FilterApplyFIR (6 Hz).
"""
from __future__ import annotations

import argparse
import contextlib
import os
import tempfile
from typing import Any, Iterator, List, Sequence, Tuple

import matplotlib

matplotlib.use("Agg")
import matplotlib.pyplot as plt  # noqa: E402

import Client3  # noqa: E402
from Client3.testing import running_host  # noqa: E402

FRAME_RATE = 100.0  # frames per second of the demo scene; the application has no frame-rate command yet


def gaps(seen: Sequence[bool]) -> List[Tuple[int, int]]:
    """The runs of frames where the marker is not seen, as (first, last) frame numbers."""
    runs: List[Tuple[int, int]] = []
    for index, visible in enumerate(seen):
        frame = index + 1
        if visible:
            continue
        if runs and runs[-1][1] == frame - 1:
            runs[-1] = (runs[-1][0], frame)
        else:
            runs.append((frame, frame))
    return runs


@contextlib.contextmanager
def application(address: str, port: int) -> Iterator[Tuple[str, int]]:
    """The given application, or one of our own when no port is given."""
    if port:
        yield address, port
    else:
        with running_host(log=False) as host:
            yield host.address, host.port


def account(client: Client3.ZarvoPelluxPostClient) -> None:
    info = client.PSL("GetServerInfo").check()
    server = dict(line.split("=", 1) for line in str(info.Str).splitlines())
    print(f"{server['Program']} {server['MajorVersion']}.{server['MinorVersion']}.{server['PointVersion']}")

    frames = client.GetFrameCount()
    scene = client.GetSceneName().check()
    print(f"scene '{scene.Name}', frames 1 to {frames} at {FRAME_RATE:g} Hz ({frames / FRAME_RATE:g} s)")

    subjects = client.GetSubjectNames().check()
    for subject in subjects.Names:
        print(f"subject {subject}:")
        for marker in client.GetMarkerNames(str(subject)).check().Names:
            seen = list(client.GetTrajectory(str(subject), str(marker)).check().E)
            print(f"  {marker!s:<6} seen in {sum(seen):5d} frames, {len(gaps(seen))} gap(s)")


def tree(client: Client3.ZarvoPelluxPostClient) -> None:
    """The top of the scene's object tree."""
    root = client.SceneGetObject("/").check()
    children = client.ObjectGetChildren(root.ID).check()
    print("objects:")
    for child, kind in zip(children.IDList, children.TypeList):
        path = client.ObjectGetPath(child).check().Str
        below = len(client.ObjectGetDescendants(child).check().IDList)
        print(f"  {path!s:<10} {kind!s:<8} {below:3d} objects below")


def save_and_reload(client: Client3.ZarvoPelluxPostClient) -> None:
    """Saves the scene, replaces it with an empty one, and loads it back."""
    before = [str(name) for name in client.GetSubjectNames().check().Names]
    with tempfile.TemporaryDirectory() as folder:
        path = os.path.join(folder, "demo.scene")
        client.SaveFile(path, "").check()
        client.NewScene().check()
        emptied = len(client.GetSubjectNames().check().Names)
        client.LoadFile(path).check()
    after = [str(name) for name in client.GetSubjectNames().check().Names]
    print(f"saved, emptied ({emptied} subjects) and reloaded: subjects {', '.join(after)}"
          f"{'' if after == before else ' (changed!)'}")


def draw(axes: Any, trajectory: Client3.Output_GetTrajectory, title: str) -> None:
    """One marker's x, y and z over time, unseen frames left out and gaps shaded."""
    seen = list(trajectory.E)
    seconds = [index / FRAME_RATE for index in range(len(seen))]
    for name, values in (("x", trajectory.X), ("y", trajectory.Y), ("z", trajectory.Z)):
        shown = [value if visible else float("nan") for value, visible in zip(values, seen)]
        axes.plot(seconds, shown, label=name)
    for number, (first, last) in enumerate(gaps(seen)):
        axes.axvspan((first - 1) / FRAME_RATE, last / FRAME_RATE, color="red", alpha=0.2, label="gap" if number == 0 else None)
    axes.set_ylabel("position (mm)")
    axes.set_title(title)
    axes.legend(loc="upper left")


def process(client: Client3.ZarvoPelluxPostClient, subject: str, marker: str) -> None:
    """Fills the subject's gaps of up to one second, then smooths the marker with a 6 Hz low-pass."""
    settings = client.OfflineGetOcclusionFixingSettings().check()
    settings.TransitionTime = 1.0
    client.OfflineSetOcclusionFixingSettings(settings).check()
    client.OfflineFixOcclusion(subject, "").check()
    obj = client.SceneGetObject(f"/{subject}/{marker}").check().ID
    x = int(str(client.ObjectGetChannel(obj, "X").check().Str))
    client.FilterApplyFIR(obj, x, "XYZ", False, 21, 6.0, 0.0, 4.0).check()


def plot(client: Client3.ZarvoPelluxPostClient, subject: str, marker: str, path: str) -> None:
    before = client.GetTrajectory(subject, marker).check()
    x = list(before.X)
    print(f"{subject}'s {marker} travels from x = {x[0]:.0f} mm to x = {x[-1]:.0f} mm")
    process(client, subject, marker)
    after = client.GetTrajectory(subject, marker).check()
    filled = sum(1 for was, now in zip(before.E, after.E) if now and not was)
    print(f"occlusion fixing and a 6 Hz low-pass: {filled} frames of {subject}'s {marker} filled")

    figure, (top, bottom) = plt.subplots(2, 1, figsize=(10, 7), sharex=True)
    draw(top, before, f"{subject} {marker} as captured")
    draw(bottom, after, f"{subject} {marker} after occlusion fixing and a 6 Hz low-pass")
    bottom.set_xlabel("time (s)")
    figure.tight_layout()
    figure.savefig(path)
    plt.close(figure)
    print(f"plot of {subject}'s {marker} written to {path}")


def main() -> None:
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("address", nargs="?", default="127.0.0.1")
    parser.add_argument("port", nargs="?", type=int, default=0, help="the application's port; none starts one")
    parser.add_argument("--plot", default="session.png", help="where to write the plot (PNG)")
    parser.add_argument("--subject", default="Alice")
    parser.add_argument("--marker", default="RWRA")
    options = parser.parse_args()
    with application(options.address, options.port) as (address, port):
        with Client3.connect(address, port) as client:
            account(client)
            tree(client)
            save_and_reload(client)
            plot(client, options.subject, options.marker, options.plot)


if __name__ == "__main__":
    try:
        main()
    except Client3.Error as error:
        raise SystemExit(f"failed: {error}")
