"""Clients at once against one host, bounded: every write kept, every read consistent, host memory
bounded. The full run, with its figures, is benchmarks/bench_load.py."""
import os
import sys

import pytest

from conftest import needs_plain_allocator

sys.path.insert(0, os.path.join(os.path.dirname(os.path.dirname(os.path.abspath(__file__))), "benchmarks"))
import bench_load  # noqa: E402


@needs_plain_allocator
@pytest.mark.skipif(not os.path.exists("/proc/self/status"), reason="needs /proc to read the host's memory")
def test_clients_at_once_lose_nothing(start_host):
    host = start_host()
    figures = bench_load.run(host.port, host.process.pid, clients=8, calls=600, seed=7)
    assert figures["lost"] == []
    assert figures["wrong"] == []
    assert figures["rss_peak"] - figures["rss_before"] < 32 << 10
    assert figures["threads_peak"] <= 8 + 2
