"""Repeated calls of every function family, success and failure paths, with the growth of resident
memory and of the interpreter's traced allocations measured over them.

    python fuzz/repeat.py --calls 1000000      # every shape a million times; prints bytes per call

The tests (tests/test_repeat.py) run the same shapes a bounded number of times."""
import argparse
import ctypes
import gc
import os
import tempfile
import time
import tracemalloc

import _Client3 as m
import suitepath  # noqa: F401  (the suite's helpers, imported where they are needed)

PAGE = os.sysconf("SC_PAGE_SIZE") if hasattr(os, "sysconf") else 4096


def resident():
    """The process's resident memory in bytes (Linux)."""
    with open("/proc/self/statm") as statm:
        return int(statm.read().split()[1]) * PAGE


class MallInfo2(ctypes.Structure):
    _fields_ = [(name, ctypes.c_size_t) for name in
                ("arena", "ordblks", "smblks", "hblks", "hblkhd", "usmblks", "fsmblks", "uordblks", "fordblks", "keepcost")]


def heap_meter():
    """A function giving the bytes that the C heap has handed out (the GNU C library's count), or None
    where that is not measurable: another C library, or another allocator in use (a sanitizer's)."""
    libc = ctypes.CDLL(None)
    if not hasattr(libc, "mallinfo2"):
        return None
    libc.mallinfo2.restype = MallInfo2
    libc.malloc.restype = ctypes.c_void_p
    in_use = lambda: libc.mallinfo2().uordblks + libc.mallinfo2().hblkhd  # noqa: E731
    before = in_use()
    block = libc.malloc(65536)
    seen = in_use() - before
    libc.free(ctypes.c_void_p(block))
    return in_use if seen >= 65536 else None


def expect(error, call, *args):
    try:
        call(*args)
    except error:
        return
    raise AssertionError(f"{call.__name__}{args} did not raise {error.__name__}")


def walk(iterator):
    try:
        while True:
            m.SwigPyIterator_next(iterator)
    except StopIteration:
        pass


def shapes(classes, client, connected):
    """(family, shape, one call) for every family; the classes make proxies that free their objects."""
    vector = classes["vectord"]([1.0, 2.0, 3.0])
    texts = classes["vectorss"](["a", "b"])
    ints = classes["vectori"]([1])
    record = classes["Output_CircleFitSettings"]()
    yield "proxy", "new and delete", lambda: classes["SafeString"]("kept")
    yield "arguments", "wrong count", lambda: expect(TypeError, m.ZarvoPelluxPostClient_Connect, client)
    yield "scalar", "int out of range", lambda: expect(OverflowError, m.vectori_append, ints, 2 ** 40)
    yield "text", "overload that does not match", lambda: expect(TypeError, m.new_SafeString, b"\xff", 1)
    yield "vector", "append and pop", lambda: (m.vectord_append(vector, 4.0), m.vectord_pop(vector))
    yield "vector", "index out of range", lambda: expect(IndexError, m.vectord___getitem__, vector, 10)
    yield "vector", "texts written and read", lambda: (m.vectorss___setitem__(texts, 0, "b"), m.vectorss___getitem__(texts, 0))
    yield "slice", "set and delete", lambda: (m.vectord___setitem__(vector, slice(3, 3), [1.0, 2.0]),
                                              m.vectord___delitem__(vector, slice(3, 5)))
    yield "slice", "extended slice of a wrong size", lambda: expect(ValueError, m.vectord___setitem__, vector, slice(0, 3, 2), [1.0])
    yield "iterator", "walk", lambda: walk(m.vectord_iterator(vector))
    yield "sequence", "lists as vector arguments", lambda: m.ZarvoPelluxPostClient_SetTrajectory(
        client, "Alice", "LANK", [1.0, 2.0], (3.0, 4.0), [5.0, 6.0], [True, False])
    yield "sequence", "bad element", lambda: expect(TypeError, m.ZarvoPelluxPostClient_SetTrajectory,
                                                    client, "Alice", "LANK", [1.0], [2.0], [3.0, "x"], [True])
    yield "record", "settings field set and get", lambda: (m.Output_CircleFitSettings_NumThreads_set(record, 3),
                                                           m.Output_CircleFitSettings_NumThreads_get(record))
    yield "record", "field of a wrong type", lambda: expect(TypeError, m.Output_CircleFitSettings_Enabled_set, record, 1)
    yield "client", "unconnected call", lambda: m.ZarvoPelluxPostClient_GetMarkerNames(client, "Alice")
    yield "client", "call that the application refuses", lambda: m.ZarvoPelluxPostClient_GetMarkerNames(connected, "Nobody")
    yield "client", "trajectory read", lambda: m.ZarvoPelluxPostClient_GetTrajectory(connected, "Alice", "LANK")
    yield "client", "request by name", lambda: m.ZarvoPelluxPostClient_PSL(connected, "GetFrameCount")


# The documented leaks, with the bytes each call leaves behind at the least: a vector made by its
# new_ function is never destroyed (its proxy's type has no destructor), and new_SafeString keeps
# each distinct text it was given for the life of the process.
VALUES = 1000


def leaks():
    counter = iter(range(10 ** 9))
    yield "vector made by new_vectord", VALUES * 8, lambda: m.new_vectord([0.5] * VALUES)
    yield "new_SafeString of a new text", VALUES, lambda: m.new_SafeString("%0*d" % (VALUES, next(counter)))


# What threads of other libraries (a cluster's event loop left by earlier work in the same process)
# allocate meanwhile is not the calls' doing.
QUIET = [tracemalloc.Filter(False, pattern) for pattern in (
    tracemalloc.__file__, "*/threading.py", "*/selectors.py", "*/queue.py", "*/asyncio/*", "*/concurrent/*",
    "*/multiprocessing/*", "*/distributed/*", "*/tornado/*", "*/dask/*", "*/psutil/*")]


def growth(call, calls, meter=resident):
    """(bytes of `meter`, traced bytes) gained per call over `calls` calls, after a tenth as many to
    settle the allocators."""
    for _ in range(max(1, calls // 10)):
        call()
    gc.collect()
    tracemalloc.start()
    before, rss = tracemalloc.take_snapshot(), meter()
    for _ in range(calls):
        call()
    gc.collect()
    after, rss_after = tracemalloc.take_snapshot(), meter()
    tracemalloc.stop()
    traced = sum(stat.size_diff for stat in after.filter_traces(QUIET).compare_to(before.filter_traces(QUIET), "filename"))
    return (rss_after - rss) / calls, traced / calls


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n\n")[0])
    parser.add_argument("--calls", type=int, default=1000000)
    options = parser.parse_args()
    import companion
    import hostproc
    classes = companion.register()
    with tempfile.TemporaryDirectory() as folder:
        host = hostproc.start(log_path=os.path.join(folder, "host.log"))
        try:
            client, connected = classes["ZarvoPelluxPostClient"](), classes["ZarvoPelluxPostClient"]()
            m.ZarvoPelluxPostClient_Connect(connected, host.address, host.port)
            print(f"{'family':10} {'shape':36} {'resident B/call':>16} {'traced B/call':>14} {'us/call':>8}")
            for family, shape, call in shapes(classes, client, connected):
                started = time.perf_counter()
                rss, traced = growth(call, options.calls)
                took = (time.perf_counter() - started) / (options.calls * 1.1) * 1e6
                print(f"{family:10} {shape:36} {rss:16.4f} {traced:14.4f} {took:8.1f}", flush=True)
            for shape, least, call in leaks():
                calls = max(1, options.calls // 100)
                rss, traced = growth(call, calls)
                print(f"{'leak':10} {shape:36} {rss:16.1f} {traced:14.4f}   (at least {least} bytes per call, {calls} calls)", flush=True)
        finally:
            host.stop()


if __name__ == "__main__":
    main()
