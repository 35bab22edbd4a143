"""Every marker's trajectory as NumPy arrays: one (frames, 3) array of positions and one mask each.

    python examples/numpy_trajectories.py                # starts its own application
    python examples/numpy_trajectories.py HOST PORT      # uses a running one
"""
from __future__ import annotations

import sys
from typing import Dict, Tuple

import numpy as np
import numpy.typing as npt

import Client3
from Client3.testing import connected

Trajectory = Tuple[npt.NDArray[np.float64], npt.NDArray[np.bool_]]


def trajectories(client: Client3.ZarvoPelluxPostClient, subject: str) -> Dict[str, Trajectory]:
    """Each marker's positions (NaN where it was not seen) and its seen-mask."""
    arrays: Dict[str, Trajectory] = {}
    for marker in client.GetMarkerNames(subject).check().Names:
        trajectory = client.GetTrajectory(subject, marker).check()
        seen = np.array(list(trajectory.E), dtype=bool)
        positions = np.column_stack([np.array(list(axis), dtype=float) for axis in (trajectory.X, trajectory.Y, trajectory.Z)])
        positions[~seen] = np.nan
        arrays[marker] = (positions, seen)
    return arrays


def report(client: Client3.ZarvoPelluxPostClient) -> None:
    for subject in client.GetSubjectNames().check().Names:
        for marker, (positions, seen) in trajectories(client, subject).items():
            speed = np.nanmean(np.linalg.norm(np.diff(positions, axis=0), axis=1)) * 100.0  # mm a frame at 100 Hz
            print(f"{subject:<6} {marker:<5} {int(seen.sum()):5d} frames seen, mean speed {speed / 1000:.2f} m/s")


def main(argv: list[str]) -> None:
    with connected(argv[1:]) as client:
        report(client)


if __name__ == "__main__":
    main(sys.argv)
