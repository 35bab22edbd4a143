"""A first session with the application: an account of the scene, then one marker's gaps filled and
its motion smoothed, plotted before and after.

    python examples/session.py                  # starts its own application on a free port
    python examples/session.py HOST PORT        # uses a running one
    python examples/session.py --out plot.png --subject Bob --marker LKNE

The picture (--out, session.png in the current folder by default) has a row for each of the
marker's x, y and z: on the left the whole take, captured samples and the gaps shaded; on the right
a zoom on the longest gap, where the samples that OfflineFixOcclusion filled (gaps of up to one
second) are drawn apart from the captured ones, with the curve after FilterApplyFIR (6 Hz).
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
    server = dict(line.split("=", 1) for line in info.Str.splitlines())
    print(f"{server['Program']} {server['MajorVersion']}.{server['MinorVersion']}.{server['PointVersion']}")

    frames = client.GetFrameCount()
    scene = client.GetSceneName().check()
    rate = client.TimelineGetFrameRate().check().Value
    print(f"scene '{scene.Name}', frames 1 to {frames} at {rate:g} Hz ({frames / rate:g} s)")

    subjects = client.GetSubjectNames().check()
    for subject in subjects.Names:
        print(f"subject {subject}:")
        for marker in client.GetMarkerNames(subject).check().Names:
            seen = list(client.GetTrajectory(subject, marker).check().E)
            print(f"  {marker:<6} seen in {sum(seen):5d} frames, {len(gaps(seen))} gap(s)")


def tree(client: Client3.ZarvoPelluxPostClient) -> None:
    """The top of the scene's object tree."""
    root = client.SceneGetObject("/").check()
    children = client.ObjectGetChildren(root.ID).check()
    print("objects:")
    for child, kind in zip(children.IDList, children.TypeList):
        path = client.ObjectGetPath(child).check().Str
        below = len(client.ObjectGetDescendants(child).check().IDList)
        print(f"  {path:<10} {kind:<8} {below:3d} objects below")


def save_and_reload(client: Client3.ZarvoPelluxPostClient) -> None:
    """Saves the scene, replaces it with an empty one, and loads it back."""
    before = client.GetSubjectNames().check().Names
    with tempfile.TemporaryDirectory() as folder:
        path = os.path.join(folder, "demo.scene")
        client.SaveFile(path, "").check()
        client.NewScene().check()
        emptied = len(client.GetSubjectNames().check().Names)
        client.LoadFile(path).check()
    after = client.GetSubjectNames().check().Names
    print(f"saved, emptied ({emptied} subjects) and reloaded: subjects {', '.join(after)}"
          f"{'' if after == before else ' (changed!)'}")


def draw(axes: Any, seconds: Sequence[float], captured: Sequence[float], seen: Sequence[bool],
         processed: Sequence[float], filled: Sequence[int]) -> None:
    """One coordinate: the captured samples, the curve after processing, and the filled samples."""
    nan = float("nan")
    axes.plot(seconds, [value if visible else nan for value, visible in zip(captured, seen)],
              color="tab:blue", linewidth=2.5, label="captured")
    axes.plot(seconds, processed, color="black", linewidth=0.8, label="after fixing and filtering")
    axes.plot([seconds[index] for index in filled], [processed[index] for index in filled], linestyle="none",
              marker="o", markersize=3, color="tab:orange", label="filled")


def window(values: Sequence[float], first: int, last: int) -> Tuple[float, float]:
    """The range of the values from index first to last, with a little room."""
    shown = [value for value in values[first : last + 1] if value == value]  # NaN is not equal to itself
    low, high = min(shown), max(shown)
    room = (high - low) * 0.1 or 1.0
    return low - room, high + room


def process(client: Client3.ZarvoPelluxPostClient, subject: str, marker: str) -> None:
    """Fills the subject's gaps of up to one second, then smooths the marker with a 6 Hz low-pass."""
    settings = client.OfflineGetOcclusionFixingSettings().check()
    settings.TransitionTime = 1.0
    client.OfflineSetOcclusionFixingSettings(settings).check()
    client.OfflineFixOcclusion(subject, "").check()
    obj = client.SceneGetObject(f"/{subject}/{marker}").check().ID
    x = int(client.ObjectGetChannel(obj, "X").check().Str)
    client.FilterApplyFIR(obj, x, "XYZ", False, 21, 6.0, 0.0, 4.0).check()


def plot(client: Client3.ZarvoPelluxPostClient, subject: str, marker: str, path: str) -> None:
    before = client.GetTrajectory(subject, marker).check()
    x = list(before.X)
    print(f"{subject}'s {marker} travels from x = {x[0]:.0f} mm to x = {x[-1]:.0f} mm")
    process(client, subject, marker)
    after = client.GetTrajectory(subject, marker).check()
    seen = list(before.E)
    filled = [index for index, (was, now) in enumerate(zip(seen, after.E)) if now and not was]
    print(f"occlusion fixing and a 6 Hz low-pass: {len(filled)} frames of {subject}'s {marker} filled")

    rate = client.TimelineGetFrameRate().check().Value
    seconds = [index / rate for index in range(len(seen))]
    runs = gaps(seen)
    first, last = max(runs, key=lambda run: run[1] - run[0]) if runs else (1, len(seen))
    margin = int(rate * 0.3)
    start, end = max(first - 1 - margin, 0), min(last - 1 + margin, len(seen) - 1)
    figure, rows = plt.subplots(3, 2, figsize=(12, 8), sharex="col", gridspec_kw={"width_ratios": (2, 1)})
    for (whole, zoom), name, captured, processed in zip(
            rows, "xyz", (before.X, before.Y, before.Z), (after.X, after.Y, after.Z)):
        for axes in (whole, zoom):
            draw(axes, seconds, list(captured), seen, list(processed), filled)
            axes.grid(alpha=0.3)
        for number, (gap_first, gap_last) in enumerate(runs):
            whole.axvspan((gap_first - 1) / rate, gap_last / rate, color="red", alpha=0.15,
                          label="gap" if number == 0 else None)
        whole.set_ylabel(f"{name} (mm)")
        zoom.set_xlim(seconds[start], seconds[end])
        zoom.set_ylim(*window(list(processed), start, end))
    rows[0][0].set_title(f"{subject} {marker}: the whole take")
    rows[0][1].set_title("the longest gap")
    rows[0][0].legend(loc="upper left", fontsize="small")
    rows[-1][0].set_xlabel("time (s)")
    rows[-1][1].set_xlabel("time (s)")
    figure.tight_layout()
    figure.savefig(path)
    plt.close(figure)
    print(f"plot of {subject}'s {marker} written to {path}")


def main() -> None:
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("address", nargs="?", default="127.0.0.1")
    parser.add_argument("port", nargs="?", type=int, default=0, help="the application's port; none starts one")
    parser.add_argument("--out", default="session.png", help="where to write the picture (default: session.png here)")
    parser.add_argument("--subject", default="Alice")
    parser.add_argument("--marker", default="RWRA")
    options = parser.parse_args()
    with application(options.address, options.port) as (address, port):
        with Client3.connect(address, port) as client:
            account(client)
            tree(client)
            save_and_reload(client)
            plot(client, options.subject, options.marker, options.out)


if __name__ == "__main__":
    try:
        main()
    except Client3.Error as error:
        raise SystemExit(f"failed: {error}")
