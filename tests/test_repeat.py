"""Repeated calls of each function family leave memory as it was; the documented leaks are the only
ones, and their size per call is what the documents say. (A million calls of each: repeat.py.)"""
import collections
import os

import pytest

import repeat
from conftest import SANITIZED

CALLS = 20000
# Allocators keep a little of what they were given: the bound is far below one leaked object per call.
RESIDENT_BOUND = 64 * 1024
TRACED_BOUND = 16 * 1024
linux = pytest.mark.skipif(not os.path.exists("/proc/self/statm"), reason="resident memory is read from /proc")


@pytest.fixture(scope="module")
def clients(registered_classes, host):
    client, connected = registered_classes["ZarvoPelluxPostClient"](), registered_classes["ZarvoPelluxPostClient"]()
    repeat.m.ZarvoPelluxPostClient_Connect(connected, host.address, host.port)
    return client, connected


def shape_names():
    """The shapes' names, listed with stand-ins for the classes."""
    stand_ins = collections.defaultdict(lambda: lambda *args: None)
    return [f"{family}: {shape}" for family, shape, _ in repeat.shapes(stand_ins, None, None)]


@linux
@pytest.mark.parametrize("index", range(len(shape_names())), ids=shape_names())
def test_repeated_calls_keep_memory_bounded(registered_classes, clients, index):
    family, shape, call = list(repeat.shapes(registered_classes, *clients))[index]
    resident, traced = repeat.growth(call, CALLS)
    assert traced * CALLS < TRACED_BOUND
    if not SANITIZED:
        assert resident * CALLS < RESIDENT_BOUND


LEAKS = list(repeat.leaks())


@linux
@pytest.mark.skipif(SANITIZED, reason="the sanitizer's quarantine grows resident memory")
@pytest.mark.parametrize("shape, least, call", LEAKS, ids=[leak[0] for leak in LEAKS])
def test_documented_leaks_have_their_size_per_call(capfd, shape, least, call):
    # The C heap's own count where there is one; resident memory, which what the heap had free before
    # absorbs a little of, elsewhere.
    meter = repeat.heap_meter()
    grown, traced = repeat.growth(call, 5000, meter or repeat.resident)
    assert least * (1 if meter else 0.9) <= grown < least * 1.25 + 256
    assert traced < 1
