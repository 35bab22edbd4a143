"""Seeded random-argument fuzzing of every module function.

    python fuzz/fuzzcalls.py --calls 1000000 --seed 1 [--batch 20000] [--jobs 2]

Each batch of calls runs in a child interpreter of its own, with a demo application on loopback for
the client functions. The arguments are drawn at random (wrong types, wrong counts, boundary
integers, None, proxies of every type, text that cannot be encoded, objects whose conversions raise,
and objects that change a vector of the same call while it is being read); the parameter types
that a function's error messages name are learnt as the batch goes, so later calls reach past the
argument checks. A child that dies is run again with every call traced, and the call it died in is
reported with the command that replays it. A SystemError from the module (a function that returned
without its exception, or with one pending) is reported as well.

Calls whose behaviour the documents leave undefined are not made; UNDEFINED lists them, each with
the way the fuzzer keeps clear of it."""
import argparse
import math
import os
import random
import re
import socket
import subprocess
import sys
import tempfile
import time
from concurrent.futures import ThreadPoolExecutor

import suitepath  # noqa: F401  (the suite's helpers, imported where they are needed)

# The calls that are not made, and how each is avoided.
UNDEFINED = [
    "delete_X with an object that others borrow from (its field and element proxies would dangle): "
    "a delete_ function is only given a proxy made for that call, or no proxy at all",
    "a proxy borrowed from a vector element or an iterator, used after its vector changed size: "
    "iterators and element proxies are made for one call and never kept",
    "a record's field proxy used after its record was released: every proxy that a call returns is "
    "kept together with that call's arguments",
    "connecting to any application other than the batch's own (a random address or port could reach "
    "another machine or another user's application): Connect gets the loopback address and either "
    "the batch's application's port or a closed one",
]

VECTORS = {
    "vectorb": ("bool", [True, False, True]),
    "vectord": ("double", [1.5, -2.0, 0.0]),
    "vectorf": ("float", [1.5, -2.0, 0.0]),
    "vectori": ("int", [1, -2, 3]),
    "vectorull": ("unsigned long long", [1, 2, 2 ** 64 - 1]),
    "vectorss": ("SafeString", ["a", "b", "c"]),
}
INTS = [0, 1, 2, 3, -1, -2, 7, 255, 65535, 2 ** 31 - 1, -(2 ** 31), 2 ** 31, 2 ** 32 - 1, 2 ** 32,
        2 ** 63 - 1, -(2 ** 63), 2 ** 64 - 1, 2 ** 64, -(2 ** 64), 10 ** 30]
FLOATS = [0.0, -0.0, 1.0, -1.5, 1e-320, 3.4e38, 3.5e38, 1e308, -1e308, math.inf, -math.inf, math.nan]
TEXTS = ["", "a", "Alice", "LANK", "Translation", "\u00e9t\u00e9", "\U0001f600", "\ud800", "x" * 300,
         "a\x00b", "GetFrameCount", "Marker", "Null", "Name=Value"]
# A vector grown beyond this by one call is emptied again, so that batches keep their pace.
LARGEST = 100000


class Hostile:
    """A value whose conversions raise."""

    def __init__(self, error=ValueError):
        self.error = error

    def conversion(self, *args):
        raise self.error("hostile")

    __index__ = __int__ = __float__ = __len__ = __getitem__ = __iter__ = __bool__ = conversion

    def __repr__(self):
        return f"Hostile({self.error.__name__})"


class Holder:
    """An object whose "this" is not a proxy."""

    this = 5


class Sequence:
    """A sequence that can lie about its length, raise part way, or change a vector while read."""

    def __init__(self, items, length=None, fail_at=None, meddle=None):
        self.items, self.length, self.fail_at, self.meddle = items, length, fail_at, meddle

    def __len__(self):
        if self.meddle:
            self.meddle()
        return len(self.items) if self.length is None else self.length

    def __getitem__(self, index):
        if self.meddle:
            self.meddle()
        if index == self.fail_at:
            raise RuntimeError("element")
        return self.items[index]

    def __iter__(self):
        return (self[i] for i in range(len(self.items)))

    def __repr__(self):
        return f"Sequence({self.items!r}, length={self.length}, fail_at={self.fail_at}, meddle={self.meddle is not None})"


class Meddler:
    """A number that changes a vector's size while it is being converted."""

    def __init__(self, value, meddle):
        self.value, self.meddle = value, meddle

    def __index__(self):
        self.meddle()
        return int(self.value)

    def __float__(self):
        self.meddle()
        return float(self.value)

    def __bool__(self):
        self.meddle()
        return bool(self.value)

    def __repr__(self):
        return f"Meddler({self.value!r})"


def documented_pending_error(name, args):
    """Whether a call may return with an exception pending: a _swiginit whose append was refused, or
    a call given a text that cannot be encoded (its error stays pending while the call goes on)."""
    if name.endswith("_swiginit"):
        return True
    for value in args:
        if isinstance(value, str):
            try:
                value.encode()
            except UnicodeEncodeError:
                return True
    return False


class Batch:
    """One child's run: its module, its values and what it has learnt of each function."""

    def __init__(self, module, classes, rng, port, closed_port):
        self.m, self.classes, self.rng = module, classes, rng
        self.port, self.closed_port = port, closed_port
        self.names = sorted(n for n in dir(module) if callable(getattr(module, n)))
        self.arity = {name: self._arity(name) for name in self.names}
        self.types = {}  # (name, position) -> the type text its message named
        self.prototypes = {}  # name -> the overloads' parameter types
        self.pool = {}  # class name -> [proxy, what keeps it valid]
        self.client = module.new_ZarvoPelluxPostClient()
        self.connected = module.new_ZarvoPelluxPostClient()
        if port:
            module.ZarvoPelluxPostClient_Connect(self.connected, "127.0.0.1?timeout=10000", port)
        self.vectors = {kind: [classes[kind](list(items)) for _ in range(3)]
                        for kind, (_, items) in VECTORS.items()}
        self.makers = [n for n in self.names if n.startswith("new_") and self.arity[n][0] == 0 and "Iterator" not in n]
        self.system_errors = []

    def _arity(self, name):
        """(fewest, most, one_object) from the count message, or from how the function is called."""
        if name.endswith("_swigregister"):
            return 1, 1, True
        try:
            getattr(self.m, name)(*([object()] * 12))
        except TypeError as error:
            text = str(error)
        else:
            return 0, 12, False
        if "takes exactly one argument" in text:
            return 1, 1, True
        if "takes no arguments" in text:
            return 0, 0, False
        counts = re.search(r"expected (at least |at most |)(\d+) arguments", text)
        if counts:
            most = int(counts.group(2))
            return (0 if counts.group(1) else most), most, False
        return 0, 5, False

    # ---- Values --------------------------------------------------------------------------------

    def meddle_with(self, vector):
        kind = type(vector).__name__
        actions = [lambda: getattr(self.m, kind + "_clear")(vector),
                   lambda: getattr(self.m, kind + "_resize")(vector, 1000),
                   lambda: getattr(self.m, kind + "_pop_back")(vector) if getattr(self.m, kind + "_size")(vector) else None]
        return self.rng.choice(actions)

    def proxy(self):
        """Any proxy of the batch: a vector, a record, a text, a client."""
        choice = self.rng.random()
        if choice < 0.4:
            return self.rng.choice(self.rng.choice(list(self.vectors.values())))
        if choice < 0.8 and self.pool:
            return self.rng.choice(self.pool[self.rng.choice(list(self.pool))])[0]
        if choice < 0.9:
            return self.rng.choice([self.client, self.connected])
        return self.fresh_iterator()

    def fresh_iterator(self):
        kind = self.rng.choice(list(self.vectors))
        start = self.rng.choice(["iterator", "begin", "end", "rbegin", "rend"])
        return self.made(kind + "_" + start, self.rng.choice(self.vectors[kind]))

    def fresh(self):
        """An owning proxy made for one call: a vector, a text, a parameter or a settings record."""
        return self.made(self.rng.choice(self.makers))

    def made(self, name, *args):
        """What a function makes, or None while a class registered by a fuzzed call refuses it."""
        try:
            return getattr(self.m, name)(*args)
        except Exception:  # noqa: BLE001
            return None

    def general(self, vector=None):
        r = self.rng
        kind = r.randrange(16)
        if kind == 0:
            return None
        if kind == 1:
            return r.choice(INTS)
        if kind == 2:
            return r.choice(FLOATS)
        if kind == 3:
            return r.choice([True, False])
        if kind == 4:
            return r.choice(TEXTS)
        if kind == 5:
            return r.choice([b"", b"abc", b"\xff\xfe", bytearray(b"xy")])
        if kind == 6:
            return Hostile(r.choice([ValueError, TypeError, OverflowError, MemoryError, KeyError]))
        if kind == 7:
            items = r.choice([[1, 2, 3], [1.5, "x"], ["a", "b"], [True, False], [], [2 ** 64, -1], [None]])
            return r.choice([list, tuple])(items)
        if kind == 8:
            items = [r.choice(INTS + FLOATS + TEXTS[:3] + [True]) for _ in range(r.randrange(5))]
            meddle = self.meddle_with(vector) if vector is not None and r.random() < 0.5 else None
            return Sequence(items, length=r.choice([None, None, 0, len(items) + 2, 2 ** 31]),
                            fail_at=r.choice([None, 0, 1]), meddle=meddle)
        if kind == 9 and vector is not None:
            return Meddler(r.choice([0, 1, 2, 1.5, True]), self.meddle_with(vector))
        if kind == 10:
            return slice(r.choice([None, 0, 1, -1, 2 ** 40, 1.5]), r.choice([None, 2, -1, 2 ** 63]),
                         r.choice([None, 1, -1, 2, 0, -(2 ** 63)]))
        if kind == 11:
            return r.choice([object(), {}, {"this": 1}, Holder(), type, 1j, Ellipsis])
        return self.proxy()

    def typed(self, text, vector):
        """A value of the parameter type that a message named, or of a near one."""
        r = self.rng
        if "SwigPyIterator" in text:
            return self.fresh_iterator()
        if "PySliceObject" in text:
            return self.general() if r.random() < 0.3 else slice(r.choice([None, 0, 1, -1, -5, 4]), r.choice([None, 2, -1, 9]), r.choice([None, 1, -1, 2, -2]))
        if "ZarvoPelluxPostClient" in text:
            return r.choice([self.client, self.connected, self.connected, None])
        record = re.search(r"(Output_\w+|Type_Parameter)", text)
        if record:
            found = self.pool.get(record.group(1))
            return r.choice(found)[0] if found and r.random() < 0.9 else self.fresh()
        if "std::vector<" in text and not re.search(r"::(value_type|size_type|difference_type)", text):
            kind = next((k for k, (element, _) in VECTORS.items() if "< " + element in text or "<" + element in text), None)
            if kind is None:
                kind = "vectorss" if "SafeString" in text else r.choice(list(VECTORS))
            return r.choice(self.vectors[kind])
        if "SafeString" in text or "char" in text:
            return r.choice(TEXTS) if r.random() < 0.85 else self.general(vector)
        if "bool" in text:
            return r.random() < 0.5 if r.random() < 0.8 else self.general(vector)
        if "double" in text or "float" in text:
            return r.choice(FLOATS) if r.random() < 0.8 else self.general(vector)
        if re.search(r"size|difference|int|long", text):
            return r.choice(INTS[:9]) if r.random() < 0.5 else self.general(vector)
        return self.general(vector)

    # ---- Calls ---------------------------------------------------------------------------------

    def arguments(self, name):
        r = self.rng
        fewest, most, _ = self.arity[name]
        prototypes = self.prototypes.get(name)
        if prototypes and r.random() < 0.8:
            types = r.choice(prototypes)
            count = len(types)
        else:
            types = None
            count = r.randint(fewest, most) if r.random() < 0.9 else r.randint(0, most + 2)
        vector = None
        args = []
        for position in range(1, count + 1):
            text = types[position - 1] if types else self.types.get((name, position))
            value = self.typed(text, vector) if text and r.random() < 0.85 else self.general(vector)
            if vector is None and type(value).__name__ in VECTORS:
                vector = value
            args.append(value)
        return self.avoid_undefined(name, args)

    def avoid_undefined(self, name, args):
        """Rewrites the arguments of the calls that UNDEFINED lists."""
        if name.startswith("delete_") and args and (hasattr(args[0], "this") or type(args[0]).__name__ == "SwigPyObject"):
            args[0] = self.fresh()
        if name == "ZarvoPelluxPostClient_Connect":
            if len(args) > 1 and isinstance(args[1], (str, bytes, bytearray)):
                args[1] = self.rng.choice(["127.0.0.1?connect=300&timeout=3000", "", "127.0.0.1?connect=x"])
            if len(args) > 2 and isinstance(args[2], int):
                args[2] = self.rng.choice([self.port or self.closed_port, self.closed_port, -1])
        return args

    def call(self, name, args, trace=None):
        function = getattr(self.m, name)
        one_object = self.arity[name][2]
        if trace:
            trace.write(f"{name}{tuple(args)!r}\n".encode("utf-8", "backslashreplace").decode())
            trace.flush()
        try:
            if one_object and len(args) == 1 and self.rng.random() < 0.95:
                result = function(args[0])
            elif one_object and self.rng.random() < 0.5:
                result = function(tuple(args))
            else:
                result = function(*args)
        except SystemError as error:
            if not documented_pending_error(name, args):
                self.system_errors.append(f"{name}: {error}")
            return
        except Exception as error:  # noqa: BLE001 - every exception is an answer; only crashes count
            self.learn(name, str(error))
            return
        self.keep(name, result, args)

    def restore(self, name):
        """Most of the time, puts back the class that a fuzzed registration replaced."""
        if name.endswith("_swigregister") and self.rng.random() < 0.9:
            self.made(name, self.classes[name[: -len("_swigregister")]])

    def learn(self, name, message):
        found = re.search(r"argument (\d+) of type '([^']*)'", message)
        if found:
            self.types[(name, int(found.group(1)))] = found.group(2)
        if "Possible C/C++ prototypes are:" in message and name not in self.prototypes:
            prototypes = []
            for line in message.split("Possible C/C++ prototypes are:")[1].strip().splitlines():
                owner, _, params = line.strip().partition("(")
                params = [p.strip() for p in re.split(r",(?![^<]*>)", params.rstrip(")")) if p.strip()]
                if "::" in owner and not owner.startswith("new_"):
                    params.insert(0, owner.rsplit("::", 1)[0] + " *")
                prototypes.append(params)
            self.prototypes[name] = prototypes

    def keep(self, name, result, args):
        """Keeps a returned proxy (with the call's arguments, which keep its owner) for later calls,
        unless it borrows from a vector or is an iterator; trims vectors that grew too large."""
        if hasattr(result, "this") and not name.startswith(("vector", "SwigPyIterator")) and "Iterator" not in type(result).__name__:
            kept = self.pool.setdefault(type(result).__name__, [])
            if len(kept) < 20:
                kept.append((result, args))
            else:
                kept[self.rng.randrange(20)] = (result, args)
        for kind, vectors in self.vectors.items():
            for vector in vectors:
                if getattr(self.m, kind + "_size")(vector) > LARGEST:
                    getattr(self.m, kind + "_clear")(vector)

    def run(self, calls, trace=None):
        for _ in range(calls):
            name = self.rng.choice(self.names)
            self.call(name, self.arguments(name), trace)
            self.restore(name)


def closed_port():
    """A loopback port that nothing listens on."""
    with socket.socket() as s:
        s.bind(("127.0.0.1", 0))
        return s.getsockname()[1]


def child(seed, calls, port, trace):
    """One batch in this interpreter; prints the SystemErrors it met, one per line."""
    import _Client3
    import companion
    classes = companion.register()
    batch = Batch(_Client3, classes, random.Random(seed), port, closed_port())
    batch.run(calls, trace)
    for line in sorted(set(batch.system_errors)):
        print("system error:", line)


def run_batch(seed, calls, timeout):
    """Runs one batch in a child, with an application of its own in a scratch directory; returns
    (a description of the crash or None, the system errors)."""
    import hostproc
    with tempfile.TemporaryDirectory() as folder:
        host = hostproc.start("--frames", "30", log_path=os.path.join(folder, "host.log"))
        try:
            return run_child(seed, calls, host.port, folder, timeout)
        finally:
            host.stop()


def run_child(seed, calls, port, folder, timeout):
    """Runs the batch's child; a child that dies is run again with its calls traced."""
    command = [sys.executable, "-X", "faulthandler", os.path.abspath(__file__), "--child",
               "--seed", str(seed), "--calls", str(calls), "--port", str(port)]
    # Under the sanitizers, memory errors are looked for but not leaks: a batch registers random classes,
    # so the documented leak of proxies without a destructor is everywhere (repeat.py measures leaks).
    options = ":".join(filter(None, [os.environ.get("ASAN_OPTIONS"), "detect_leaks=0"]))
    environment = dict(os.environ, PYTHONHASHSEED="0", ASAN_OPTIONS=options)
    try:
        done = subprocess.run(command, capture_output=True, text=True, timeout=timeout, cwd=folder, env=environment)
    except subprocess.TimeoutExpired:
        return f"seed {seed}: no answer within {timeout}s", []
    errors = [line[len("system error: "):] for line in done.stdout.splitlines() if line.startswith("system error: ")]
    if done.returncode == 0:
        return None, errors
    trace = os.path.join(folder, "calls.trace")
    subprocess.run(command + ["--trace", trace], capture_output=True, timeout=timeout * 4, cwd=folder, env=environment)
    with open(trace, encoding="utf-8", errors="replace") as traced:
        lines = traced.read().splitlines()
    last = lines[-1] if lines else "(no call traced)"
    return (f"seed {seed}: exit status {done.returncode} in call {len(lines)}: {last}\n"
            f"  replay: PYTHONHASHSEED=0 python {os.path.relpath(__file__)} --child --seed {seed} --calls {calls} --port PORT\n"
            f"  {done.stderr.strip()[-3000:]}"), errors


def fuzz(seed, calls, batch, jobs=1, timeout=600):
    """Runs `calls` calls in batches of `batch` (seeds seed, seed+1, ...); returns (crashes, system errors)."""
    sizes = [min(batch, calls - start) for start in range(0, calls, batch)]
    seeds = range(seed, seed + len(sizes))
    with ThreadPoolExecutor(jobs) as pool:
        results = list(pool.map(run_batch, seeds, sizes, [timeout] * len(sizes)))
    crashes = [crash for crash, _ in results if crash]
    errors = sorted({error for _, found in results for error in found})
    return crashes, errors


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n\n")[0])
    parser.add_argument("--calls", type=int, default=100000)
    parser.add_argument("--seed", type=int, default=1)
    parser.add_argument("--batch", type=int, default=20000)
    parser.add_argument("--jobs", type=int, default=1)
    parser.add_argument("--child", action="store_true", help=argparse.SUPPRESS)
    parser.add_argument("--trace", help=argparse.SUPPRESS)
    parser.add_argument("--port", type=int, default=0, help=argparse.SUPPRESS)
    options = parser.parse_args()
    if options.child:
        trace = open(options.trace, "w") if options.trace else None
        child(options.seed, options.calls, options.port, trace)
        return 0
    print("calls whose behaviour is undefined, not made:")
    for rule in UNDEFINED:
        print("  -", rule)
    started = time.monotonic()
    crashes, errors = fuzz(options.seed, options.calls, options.batch, options.jobs)
    print(f"{options.calls} calls from seed {options.seed} in {time.monotonic() - started:.0f}s: "
          f"{len(crashes)} crashes, {len(errors)} system errors")
    for line in crashes + errors:
        print(line)
    return 1 if crashes or errors else 0


if __name__ == "__main__":
    sys.exit(main())
