"""Writes a trajectory back: fills one marker's gaps by linear interpolation and sends the result.

    python examples/write_trajectory.py                  # starts its own application
    python examples/write_trajectory.py HOST PORT        # uses a running one (its scene changes)
"""
from __future__ import annotations

import sys
from typing import List, Tuple

import Client3
from Client3.testing import connected

SUBJECT, MARKER = "Alice", "RWRA"


def interpolated(values: List[float], seen: List[bool]) -> List[float]:
    """The values with every gap between two seen frames filled on the straight line between them."""
    filled = list(values)
    known = [index for index, visible in enumerate(seen) if visible]
    for before, after in zip(known, known[1:]):
        for index in range(before + 1, after):
            share = (index - before) / (after - before)
            filled[index] = values[before] + share * (values[after] - values[before])
    return filled


def fill_gaps(client: Client3.ZarvoPelluxPostClient) -> Tuple[int, int]:
    trajectory = client.GetTrajectory(SUBJECT, MARKER).check()
    seen = list(trajectory.E)
    first, last = seen.index(True), len(seen) - 1 - seen[::-1].index(True)
    axes = [interpolated(list(axis), seen) for axis in (trajectory.X, trajectory.Y, trajectory.Z)]
    now_seen = [first <= index <= last for index in range(len(seen))]
    client.SetTrajectory(SUBJECT, MARKER, axes[0], axes[1], axes[2], now_seen).check()
    return seen.count(False), list(client.GetTrajectory(SUBJECT, MARKER).check().E).count(False)


def main(argv: list[str]) -> None:
    with connected(argv[1:]) as client:
        before, after = fill_gaps(client)
    print(f"{SUBJECT}'s {MARKER}: {before} frames unseen before, {after} after")


if __name__ == "__main__":
    main(sys.argv)
