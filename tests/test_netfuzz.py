"""The network fuzzer (fuzz/netfuzz.py), bounded: the host keeps serving a well-behaved client within
bounded memory and threads through 1,000 rounds of bad peers."""
import os

import pytest

import netfuzz
from conftest import needs_plain_allocator

ROUNDS = 1000
SECONDS = 120  # the fuzz, at most


@pytest.mark.skipif(not os.path.exists("/proc/self/status"), reason="needs /proc to read the host's memory and threads")
@needs_plain_allocator
def test_host_survives_the_network_fuzzer(start_host):
    netfuzz.fuzz(start_host(), ROUNDS, SECONDS, netfuzz.SEED)
