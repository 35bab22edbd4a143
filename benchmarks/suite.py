"""The module's calling shapes against a do-nothing C floor of the same calling convention.

Run: python benchmarks/suite.py [--quick]

Builds its floor (benchmarks/floor.c: one-object and tuple functions that do nothing, C loops that read
a sequence into a fresh native buffer, and an extension without functions) into a temporary directory
with the interpreter's own compiler settings, then prints one table: shape, ours, floor, ratio. Every
figure is the best of several repeats, ours and the floor measured one after the other in each repeat.
Calls are measured on bare proxies (the companion's classes are not registered); objects a call hands
out owned are deleted in the same statement, and the floor calls a do-nothing function in their place.
The last table sets Client3's methods against the flat calls they make, its classes registered.
"""
import argparse
import ctypes
import os
import platform
import re
import shlex
import subprocess
import sys
import sysconfig
import tempfile
import timeit
from array import array

HERE = os.path.dirname(os.path.abspath(__file__))
FLOOR_PEER = "not built (see docs/speed.md)"


# ---- The floor ----------------------------------------------------------------------------------

def build_floor(directory):
    """Compiles floor.c twice (the floor and the empty extension) and returns their directory."""
    suffix = sysconfig.get_config_var("EXT_SUFFIX")
    compiler = shlex.split(sysconfig.get_config_var("CC") or "cc")
    flags = shlex.split(sysconfig.get_config_var("CFLAGS") or "") + shlex.split(sysconfig.get_config_var("CCSHARED") or "")
    linker = shlex.split(sysconfig.get_config_var("LDSHARED") or "cc -shared")
    include = sysconfig.get_paths()["include"]
    # Without the sanitizer runtime that a sanitized test run preloads: the compiler is not ours to check.
    environment = {k: v for k, v in os.environ.items() if k != "LD_PRELOAD"}
    for name, define in (("_c3floor", []), ("_c3floor_empty", ["-DFLOOR_EMPTY"])):
        obj = os.path.join(directory, name + ".o")
        steps = [compiler + flags + define + ["-I", include, "-c", os.path.join(HERE, "floor.c"), "-o", obj],
                 linker + [obj, "-o", os.path.join(directory, name + suffix)]]
        for command in steps:
            done = subprocess.run(command, capture_output=True, text=True, env=environment)
            if done.returncode != 0:
                raise SystemExit("building the floor failed:\n%s\n%s" % (" ".join(command), done.stderr))
    return directory


# ---- Measuring ----------------------------------------------------------------------------------

class Row:
    """One line of the table: `ours` and `floor` are statements timed in the same scope; `per` divides
    the time of one run into the unit shown (calls or elements); `unit` is ns or ms."""

    def __init__(self, shape, ours, floor, scope, number, per=1, unit="ns"):
        self.shape, self.per, self.unit = shape, per, unit
        self.timers = [timeit.Timer(ours, globals=scope)] + ([timeit.Timer(floor, globals=scope)] if floor else [])
        self.number = number
        self.best = [float("inf")] * len(self.timers)

    def run_once(self):
        for k, timer in enumerate(self.timers):
            seconds = timer.timeit(self.number) / self.number / self.per
            self.best[k] = min(self.best[k], seconds)

    def cells(self):
        scale = 1e9 if self.unit == "ns" else 1e3
        ours = "%.4g %s" % (self.best[0] * scale, self.unit)
        if len(self.best) < 2:
            return ours, "-", "-"
        return ours, "%.4g %s" % (self.best[1] * scale, self.unit), "%.2f" % (self.best[0] / self.best[1])


def measure(rows, repeats):
    for _ in range(repeats):
        for row in rows:
            row.run_once()


def import_self_times(modules, path, runs, cumulative=False):
    """Best self time (microseconds) of `import module` in a fresh interpreter, from -X importtime, for
    each module (with what it imports, when `cumulative`); the modules take turns."""
    best = dict.fromkeys(modules, float("inf"))
    env = dict(os.environ, PYTHONPATH=os.pathsep.join([path, os.environ.get("PYTHONPATH", "")]))
    for _ in range(runs):
        for module in modules:
            done = subprocess.run([sys.executable, "-X", "importtime", "-c", "import " + module],
                                  capture_output=True, text=True, env=env)
            for line in done.stderr.splitlines():
                found = re.match(r"import time:\s+(\d+) \|\s+(\d+) \|\s+%s$" % re.escape(module), line)
                if found:
                    best[module] = min(best[module], int(found.group(2 if cumulative else 1)))
    return [best[module] for module in modules]


def native_heap():
    """A function giving the bytes of the C heap in use (the GNU C library's count), or None."""
    try:
        libc = ctypes.CDLL(None)
        mallinfo2 = libc.mallinfo2
    except (OSError, AttributeError, TypeError):  # no C library to open, or not the GNU one
        return None

    class MallInfo2(ctypes.Structure):
        _fields_ = [(name, ctypes.c_size_t) for name in ("arena", "ordblks", "smblks", "hblks", "hblkhd", "usmblks",
                                                         "fsmblks", "uordblks", "fordblks", "keepcost")]

    mallinfo2.restype = MallInfo2
    return lambda: mallinfo2().uordblks + mallinfo2().hblkhd


def memory_per_element(make, count):
    """Bytes of C heap per element that `make()` keeps (the proxy object is the interpreter's), or None."""
    in_use = native_heap()
    if in_use is None:
        return None
    before = in_use()
    made = make()
    return made, (in_use() - before) / count


# ---- The shapes ---------------------------------------------------------------------------------

def call_rows(m, f, number):
    """The calling shapes, each with the floor of its convention."""
    v = m.new_vectord([float(i) for i in range(1000)])
    circle = m.new_Output_CircleFitSettings()
    recon = m.new_Output_ReconstructSettings()
    labels = m.new_Output_LabelROMSettings()
    ticks = m.ZarvoPelluxPostClient_TimelineGetTicks(None)
    trajectory = m.ZarvoPelluxPostClient_GetTrajectory(None, "a", "b")
    text = m.new_SafeString("motion capture")
    client = m.new_ZarvoPelluxPostClient()
    it = m.vectord_iterator(v)
    scope = dict(m=m, f=f, v=v, circle=circle, recon=recon, labels=labels, ticks=ticks, trajectory=trajectory,
                 text=text, client=client, it=it, sl=slice(2, 12), r1000=range(1000), xs=m.new_vectord([1.0]),
                 w=m.new_vectord())
    one, t1, t2, t3, t4, t5, t6, t7, t8 = "f.one", "f.t1", "f.t2", "f.t3", "f.t4", "f.t5", "f.t6", "f.t7", "f.t8"
    lines = [
        # One object.
        ("int field get (one object)", "m.Output_CircleFitSettings_NumThreads_get(circle)", one + "(circle)"),
        ("bool field get", "m.Output_CircleFitSettings_Enabled_get(circle)", one + "(circle)"),
        ("unsigned int field get", "m.Output_ReconstructSettings_MinCamsToStartTrajectory_get(recon)", one + "(recon)"),
        ("unsigned long long field get", "m.Output_GetUnsignedLong_Value_get(ticks)", one + "(ticks)"),
        ("float field get", "m.Output_LabelROMSettings_StandardDeviation_get(labels)", one + "(labels)"),
        ("double field get", "m.Output_ReconstructSettings_ReconMinSeparation_get(recon)", one + "(recon)"),
        ("enum field get (base class, cast list)", "m.Output_Result_Result_get(circle)", one + "(circle)"),
        ("string field get", "m.Output_ReconstructSettings_FitMethod_get(recon)", one + "(recon)"),
        ("vector field get", "m.Output_GetTrajectory_X_get(trajectory)", one + "(trajectory)"),
        ("SafeString_Value", "m.SafeString_Value(text)", one + "(text)"),
        ("ToString(1003)", "m.ToString(1003)", one + "(1003)"),
        ("vectord___len__", "m.vectord___len__(v)", one + "(v)"),
        ("vectord_size", "m.vectord_size(v)", one + "(v)"),
        ("SwigPyIterator_value", "m.SwigPyIterator_value(it)", one + "(it)"),
        ("client call, unconnected (GetFrameCount)", "m.ZarvoPelluxPostClient_GetFrameCount(client)", one + "(client)"),
        # Tuples.
        ("int field set (tuple of 2)", "m.Output_CircleFitSettings_NumThreads_set(circle, 4)", t2 + "(circle, 4)"),
        ("bool field set", "m.Output_CircleFitSettings_Enabled_set(circle, True)", t2 + "(circle, True)"),
        ("unsigned int field set", "m.Output_ReconstructSettings_MinCamsToStartTrajectory_set(recon, 3)",
         t2 + "(recon, 3)"),
        ("unsigned long long field set", "m.Output_GetUnsignedLong_Value_set(ticks, 7)", t2 + "(ticks, 7)"),
        ("float field set", "m.Output_LabelROMSettings_StandardDeviation_set(labels, 0.5)", t2 + "(labels, 0.5)"),
        ("double field set", "m.Output_ReconstructSettings_ReconMinSeparation_set(recon, 2.5)", t2 + "(recon, 2.5)"),
        ("string field set", "m.Output_ReconstructSettings_FitMethod_set(recon, text)", t2 + "(recon, text)"),
        ("vector field set", "m.Output_GetTrajectory_X_set(trajectory, xs)", t2 + "(trajectory, xs)"),
        ("vectord_append + pop_back (tuple of 2, one object)", "m.vectord_append(w, 1.5); m.vectord_pop_back(w)",
         t2 + "(w, 1.5); " + one + "(w)"),
        ("vectord_assign (tuple of 3)", "m.vectord_assign(xs, 1, 2.5)", t3 + "(xs, 1, 2.5)"),
        ("client call, tuple of 4 (ChannelHasKey)",
         "m.delete_Output_GetString(m.ZarvoPelluxPostClient_ChannelHasKey(client, 1, 2, 3))",
         one + "(" + t4 + "(client, 1, 2, 3))"),
        ("client call, tuple of 5 (ParameterGet)",
         "m.delete_Output_GetString(m.ZarvoPelluxPostClient_ParameterGet(client, 1, 2, 3, 'x'))",
         one + "(" + t5 + "(client, 1, 2, 3, 'x'))"),
        ("client call, tuple of 6 (ParameterSet)",
         "m.delete_Output_Result(m.ZarvoPelluxPostClient_ParameterSet(client, 1, 2, 3, 'x', 'y'))",
         one + "(" + t6 + "(client, 1, 2, 3, 'x', 'y'))"),
        ("client call, tuple of 7 (ChannelGetValue)",
         "m.delete_Output_GetAttribute(m.ZarvoPelluxPostClient_ChannelGetValue(client, 1, 2, 3, 4, 5, 'x'))",
         one + "(" + t7 + "(client, 1, 2, 3, 4, 5, 'x'))"),
        ("client call, tuple of 8 (ChannelSetValue)",
         "m.delete_Output_Result(m.ZarvoPelluxPostClient_ChannelSetValue(client, 1, 2, 3, 4, 5, 'x', 'y'))",
         one + "(" + t8 + "(client, 1, 2, 3, 4, 5, 'x', 'y'))"),
        # Overloaded functions: by type, then by count.
        ("vectord___getitem__(v, 3) (overloaded, by type)", "m.vectord___getitem__(v, 3)", t2 + "(v, 3)"),
        ("vectord___getitem__(v, slice) + disown", "m.vectord___getitem__(v, sl).disown()",
         one + "(" + t2 + "(v, sl))"),
        ("vectord___getslice__(v, 2, 12) + disown", "m.vectord___getslice__(v, 2, 12).disown()",
         one + "(" + t3 + "(v, 2, 12))"),
        ("vectord___setitem__(v, 3, x) (overloaded)", "m.vectord___setitem__(v, 3, 0.5)", t3 + "(v, 3, 0.5)"),
        ("SwigPyIterator_incr + decr (overloaded, tuple of 1)",
         "m.SwigPyIterator_incr(it); m.SwigPyIterator_decr(it)", t1 + "(it); " + t1 + "(it)"),
        ("new_vectord(4) + disown (overloaded, tuple of 1)", "m.new_vectord(4).disown()",
         one + "(" + t1 + "(4))"),
    ]
    # Calls that hand out a vector leak it (the module has no function that frees a vector): fewer runs.
    rows = [Row(shape, ours, floor, scope, number // 10 if "disown" in ours else number) for shape, ours, floor in lines]
    # Iteration: 1,000 steps of SwigPyIterator___next__ over a vector of 1,000, per element.
    rows.append(Row("iteration, per element (SwigPyIterator___next__)",
                    "i = m.vectord_iterator(v)\nfor _ in r1000: m.SwigPyIterator___next__(i)\nm.delete_SwigPyIterator(i)",
                    "i = f.one(v)\nfor _ in r1000: f.one(i)\nf.one(i)", scope, max(1, number // 1000), per=1000))
    return rows, scope


def conversion_rows(m, f, size, number):
    """Sources of `size` elements to a vector, against the C loop into a fresh buffer."""
    floats = [i * 0.5 for i in range(size)]
    ints = list(range(size))
    scope = dict(m=m, f=f, floats=floats, ints=ints, tfloats=tuple(floats), afloats=array("d", floats),
                 aints=array("i", ints), bools=[i % 3 == 0 for i in range(size)],
                 texts=["marker%d" % (i % 100) for i in range(size)], size=size)
    lines = [
        ("list of floats -> vectord", "m.new_vectord(floats).disown()", "f.fill_d(floats)"),
        ("tuple of floats -> vectord", "m.new_vectord(tfloats).disown()", "f.fill_d(tfloats)"),
        ("array('d') -> vectord", "m.new_vectord(afloats).disown()", "f.fill_d(afloats)"),
        ("list of floats -> vectorf", "m.new_vectorf(floats).disown()", "f.fill_f(floats)"),
        ("list of ints -> vectori", "m.new_vectori(ints).disown()", "f.fill_i(ints)"),
        ("array('i') -> vectori", "m.new_vectori(aints).disown()", "f.fill_i(aints)"),
        ("list of ints -> vectorull", "m.new_vectorull(ints).disown()", "f.fill_Q(ints)"),
        ("list of bools -> vectorb", "m.new_vectorb(bools).disown()", "f.fill_b(bools)"),
        ("list of str -> vectorss", "m.new_vectorss(texts).disown()", None),
    ]
    rows = [Row(shape, ours, floor, scope, number, unit="ms") for shape, ours, floor in lines]
    rows.append(Row("first touch of a fresh 8-byte-element buffer", "f.touch(size * 8)", None, scope, number,
                    unit="ms"))
    return rows


def memory_rows(m, size):
    """Resident bytes per element of each vector made from a list, next to the element's own size."""
    sources = {
        "vectord": ([i * 0.5 for i in range(size)], 8),
        "vectorf": ([i * 0.5 for i in range(size)], 4),
        "vectori": (list(range(size)), 4),
        "vectorull": (list(range(size)), 8),
        "vectorb": ([i % 2 == 0 for i in range(size)], 0.125),
        "vectorss": (["marker%d" % (i % 100) for i in range(size)], None),
    }
    lines = []
    for name, (source, floor) in sources.items():
        found = memory_per_element(lambda: getattr(m, "new_" + name)(source), size)
        if found is None:
            return []
        made, per = found
        getattr(m, name + "_clear")(made)
        made.disown()
        lines.append(("memory per element, " + name, "%.2f B" % per, "%g B" % floor if floor else "-",
                      "%.2f" % (per / floor) if floor else "-"))
    return lines


def round_trip_row(m, number):
    """GetFrameCount on a client connected to a host on loopback (no floor: see bench_client.py)."""
    try:
        from Client3.testing import running_host
    except ImportError:
        return None
    with running_host(scene="demo", log=False) as host:
        client = m.new_ZarvoPelluxPostClient()
        connected = m.ZarvoPelluxPostClient_Connect(client, host.address, host.port)
        if m.Output_Result_Result_get(connected) != m.Success:
            raise SystemExit("could not connect to the host on port %d" % host.port)
        m.delete_Output_Result(connected)
        row = Row("round trip to the host (GetFrameCount)", "m.ZarvoPelluxPostClient_GetFrameCount(client)", None,
                  dict(m=m, client=client), number)
        measure([row], 3)
        m.ZarvoPelluxPostClient_Disconnect(client)
        m.delete_ZarvoPelluxPostClient(client)
    return row


def companion_rows(m, number):
    """Client3's methods against the flat call each makes (the floor column), on a client that was never
    connected and on one connected to a host on loopback, by position and by keyword; Client3's classes
    are registered for both. Measured last, since importing Client3 registers its classes."""
    import Client3
    from Client3.testing import running_host

    host = running_host(scene="demo", log=False)
    running = host.__enter__()
    scope = dict(m=m, c=Client3.Client(), h=Client3.connect(running.address, running.port))
    lines = [
        ("Client3 GetFrameCount, unconnected", "c.GetFrameCount()", "m.ZarvoPelluxPostClient_GetFrameCount(c)"),
        ("Client3 ParameterGet, unconnected, by position", "c.ParameterGet(1, 2, 3, 'x')",
         "m.ZarvoPelluxPostClient_ParameterGet(c, 1, 2, 3, 'x')"),
        ("Client3 ParameterGet, unconnected, by keyword", "c.ParameterGet(object=1, parameter=2, kind=3, field='x')",
         "m.ZarvoPelluxPostClient_ParameterGet(c, 1, 2, 3, 'x')"),
        ("Client3 ChannelSetValue, unconnected, by keyword",
         "c.ChannelSetValue(object=1, channel=2, frame=3, component=4, interpolation=5, value='x', options='y')",
         "m.ZarvoPelluxPostClient_ChannelSetValue(c, 1, 2, 3, 4, 5, 'x', 'y')"),
        ("Client3 GetTrajectoryAtFrame, host, by position", "h.GetTrajectoryAtFrame('Alice', 'LANK', 5)",
         "m.ZarvoPelluxPostClient_GetTrajectoryAtFrame(h, 'Alice', 'LANK', 5)"),
        ("Client3 GetTrajectoryAtFrame, host, by keyword", "h.GetTrajectoryAtFrame(subject='Alice', marker='LANK', frame=5)",
         "m.ZarvoPelluxPostClient_GetTrajectoryAtFrame(h, 'Alice', 'LANK', 5)"),
    ]
    rows = [Row(shape, ours, floor, scope, number // 20 if ", host," in shape else number) for shape, ours, floor in lines]
    return rows, lambda: (scope["h"].Disconnect(), host.__exit__(None, None, None))


# ---- The table ----------------------------------------------------------------------------------

def print_table(title, lines):
    print()
    print("| %s | ours | floor | ratio |" % title)
    print("|---|---:|---:|---:|")
    for shape, ours, floor, ratio in lines:
        print("| %s | %s | %s | %s |" % (shape, ours, floor, ratio))


def main(argv=None):
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--quick", action="store_true", help="few repeats, small sizes: checks the suite runs")
    options = parser.parse_args(argv)
    repeats, number, size, conversions = (2, 2000, 10_000, 2) if options.quick else (7, 200_000, 1_000_000, 3)

    import _Client3 as m

    with tempfile.TemporaryDirectory() as directory:
        sys.path.insert(0, build_floor(directory))
        import _c3floor as f

        print("# _Client3 benchmark suite%s" % (" (quick)" if options.quick else ""))
        print("machine: %s, %s, %d cores; %s" % (platform.platform(), platform.processor() or platform.machine(),
                                                   os.cpu_count() or 0, cpu_model()))
        print("interpreter: %s %s (%s)" % (platform.python_implementation(), platform.python_version(),
                                          sysconfig.get_config_var("CC")))
        print("every figure is the best of %d interleaved repeats; floor: a do-nothing C function of the same "
              "convention; peer binding column: %s" % (repeats, FLOOR_PEER))

        calls, scope = call_rows(m, f, number)
        measure(calls, repeats)
        print_table("calling shape (per call)", [(row.shape, *row.cells()) for row in calls])
        release(m, scope)

        converted = conversion_rows(m, f, size, conversions)
        measure(converted, repeats)
        print_table("%d elements to a vector (floor: a C loop into a fresh buffer)" % size,
                    [(row.shape, *row.cells()) for row in converted])

        runs = 3 if options.quick else 15
        ours, empty = import_self_times(["_Client3", "_c3floor_empty"], directory, runs)
        lines = [("import (self time)", "%d us" % ours, "%d us" % empty, "%.2f" % (ours / empty))]
        lines += memory_rows(m, size)
        trip = round_trip_row(m, 200 if options.quick else 5000)
        if trip is not None:
            lines.append((trip.shape, *trip.cells()))
        package, = import_self_times(["Client3"], directory, runs, cumulative=True)
        lines.append(("import Client3 (with what it imports)", "%d us" % package, "-", "-"))
        print_table("start-up, memory and the host", lines)

        companion, stop = companion_rows(m, number)
        try:
            measure(companion, repeats)
        finally:
            stop()
        print_table("the Client3 package (floor: the flat call it makes)", [(row.shape, *row.cells()) for row in companion])
    return 0


def release(m, scope):
    """Frees what call_rows made, so that no proxy reports a leak at exit."""
    for name, kind in (("circle", "Output_CircleFitSettings"), ("recon", "Output_ReconstructSettings"),
                       ("labels", "Output_LabelROMSettings"), ("ticks", "Output_GetUnsignedLong"),
                       ("trajectory", "Output_GetTrajectory"), ("text", "SafeString"),
                       ("client", "ZarvoPelluxPostClient"), ("it", "SwigPyIterator")):
        getattr(m, "delete_" + kind)(scope[name])
    for name in ("v", "xs", "w"):
        m.vectord_clear(scope[name])
        scope[name].disown()


def cpu_model():
    try:
        with open("/proc/cpuinfo") as f:
            for line in f:
                if line.startswith("model name"):
                    return line.split(":", 1)[1].strip()
    except OSError:
        pass
    return "unknown processor"


if __name__ == "__main__":
    sys.exit(main())
