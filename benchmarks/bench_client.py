"""Round trips through _Client3 against a live application, next to raw loopback exchanges of the same bytes.

    python benchmarks/bench_client.py            # best of 7 runs
    python benchmarks/bench_client.py --quick    # a few calls each: only checks that everything runs

Starts its own client3-host on a free loopback port and builds bench_client_floor.cpp with g++ -O2 into a
temporary folder. Two measurements:

1. ZarvoPelluxPostClient_GetFrameCount, against a ping-pong of frames of the same sizes between two threads of
   the floor program, the same ping-pong from a Python socket client to the floor program's server, and a raw
   C++ client of the real host.
2. ZarvoPelluxPostClient_GetTrajectory of one marker over 100,000 frames, against the floor program sending a
   reply of the same size over loopback and decoding it into four std::vectors, and the raw C++ client of
   the real host doing the same.

The contenders take turns: each of the 7 rounds runs every one of them once, and each keeps its best round,
so that a busy machine weighs on all of them alike. Every loop has a fixed count, every socket and process
wait has a time limit, and every process started here is stopped before the benchmark ends.
"""
import argparse
import os
import selectors
import shutil
import socket
import struct
import subprocess
import sys
import sysconfig
import tempfile
import time

import _Client3 as m

HERE = os.path.dirname(os.path.abspath(__file__))
ROOT = os.path.dirname(HERE)
FRAMES = 100_000
SUBJECT, MARKER = "Alice", "LANK"
WAIT = 60  # seconds any one step may take before the benchmark gives up

# Frame sizes from the wire format: a u32 length, then the payload.
HEADER = 4
# request: kind, u32 id, u16 command
COUNT_REQUEST = 1 + 4 + 2
# reply: kind, u32 id, i32 code, message (u32 count + no bytes), the count (tag + u32)
COUNT_REPLY = 1 + 4 + 4 + 4 + 1 + 4
# request: kind, id, command, two texts (tag + u32 count + bytes)
TRAJECTORY_REQUEST = 1 + 4 + 2 + (1 + 4 + len(SUBJECT)) + (1 + 4 + len(MARKER))
# reply: kind, id, code, empty message, three double arrays and one bool array (tag + u32 count + elements)
TRAJECTORY_REPLY = 1 + 4 + 4 + 4 + 3 * (1 + 4 + 8 * FRAMES) + (1 + 4 + FRAMES)


def register_classes():
    """Gives every wrapped class a script class that frees what its proxies own, so records do not pile up."""
    for name in dir(m):
        if name.endswith("_swigregister"):
            cls = name[: -len("_swigregister")]
            destroy = getattr(m, "delete_" + cls, None)
            getattr(m, name)(type(cls, (), {"__swig_destroy__": destroy} if destroy else {}))


def build_floor(folder):
    program = os.path.join(folder, "floor")
    source = os.path.join(HERE, "bench_client_floor.cpp")
    # Without the sanitizer runtime that a sanitized test run preloads: the compiler is not ours to check.
    environment = {k: v for k, v in os.environ.items() if k != "LD_PRELOAD"}
    subprocess.run(["g++", "-O2", "-std=c++20", "-pthread", "-I", ROOT, "-I", os.path.join(ROOT, "include"), source,
                    "-o", program],
                   check=True, timeout=300, env=environment)
    return program


def run_floor(program, *args):
    """Runs the floor program to its end; returns its "name value" lines as a dict of numbers."""
    done = subprocess.run([program, *map(str, args)], capture_output=True, text=True, timeout=WAIT * 5)
    if done.returncode != 0:
        raise RuntimeError(f"floor {args[0]} failed ({done.returncode}): {done.stderr.strip()}")
    return {name: float(value) for name, value in (line.split() for line in done.stdout.splitlines())}


def start(command):
    """Starts a server that prints "listening on 127.0.0.1:PORT" first; returns the process and its port."""
    process = subprocess.Popen(command, stdout=subprocess.PIPE, stderr=subprocess.DEVNULL, text=True)
    with selectors.DefaultSelector() as selector:
        selector.register(process.stdout, selectors.EVENT_READ)
        ready = selector.select(timeout=WAIT)
    first = process.stdout.readline() if ready else ""
    if not first.startswith("listening on "):
        stop(process)
        raise RuntimeError(f"{command[0]} did not start: {first!r}")
    return process, int(first.rsplit(":", 1)[1])


def stop(process):
    if process.poll() is None:
        process.terminate()
        try:
            process.wait(timeout=10)
        except subprocess.TimeoutExpired:
            process.kill()
            process.wait(timeout=10)
    if process.stdout:
        process.stdout.close()


def best(calls, runs, once):
    """The best time per call, in seconds, over `runs` runs of `calls` calls of `once` (after an untimed tenth)."""
    for _ in range(calls // 10 + 1):
        once()
    times = []
    for _ in range(runs):
        start_time = time.perf_counter()
        for _ in range(calls):
            once()
        times.append(time.perf_counter() - start_time)
    return min(times) / calls


def python_ping_pong(program, calls):
    """A plain Python socket client exchanging frames of the GetFrameCount sizes with the floor program's server."""
    server, port = start([program, "serve", str(COUNT_REPLY)])
    try:
        with socket.create_connection(("127.0.0.1", port), timeout=WAIT) as s:
            s.setsockopt(socket.IPPROTO_TCP, socket.TCP_NODELAY, 1)
            request = struct.pack("<IcIH", COUNT_REQUEST, b"Q", 0, 0)
            header = bytearray(HEADER)
            payload = bytearray(COUNT_REPLY)

            def receive(buffer):
                view, got = memoryview(buffer), 0
                while got < len(buffer):
                    n = s.recv_into(view[got:])
                    if n == 0:
                        raise RuntimeError("the floor server closed")
                    got += n

            def exchange():
                s.sendall(request)
                receive(header)
                receive(payload)

            return best(calls, 1, exchange)
    finally:
        stop(server)


def text(safe_string):
    return m.SafeString_Value(safe_string)


def check(record, what):
    code = m.Output_Result_Result_get(record)
    if code != m.Success:
        raise RuntimeError(f"{what} failed ({code}): {text(m.Output_Result_ResultString_get(record))}")
    return record


def check_client(client):
    """The host has the take and the marker that the floors imitate."""
    frames = m.ZarvoPelluxPostClient_GetFrameCount(client)
    if frames != FRAMES:
        raise RuntimeError(f"the host has {frames} frames, not {FRAMES}")
    record = check(m.ZarvoPelluxPostClient_GetTrajectory(client, SUBJECT, MARKER), "GetTrajectory")
    sizes = [m.vectord_size(getattr(m, f"Output_GetTrajectory_{axis}_get")(record)) for axis in "XYZ"]
    sizes.append(m.vectorb_size(m.Output_GetTrajectory_E_get(record)))
    if sizes != [FRAMES] * 4:
        raise RuntimeError(f"GetTrajectory gave {sizes} elements, not {FRAMES} each")


def measure(program, port, runs, calls, trajectory_calls):
    """The best time per call of each contender, in seconds. Each round runs every contender once, so that
    whatever else the machine is doing weighs on all of them alike."""
    figures = {}

    def keep(name, seconds):
        figures[name] = min(figures.get(name, seconds), seconds)

    client = m.new_ZarvoPelluxPostClient()
    try:
        check(m.ZarvoPelluxPostClient_Connect(client, "127.0.0.1", port), "Connect")
        check_client(client)
        frame_count, get_trajectory = m.ZarvoPelluxPostClient_GetFrameCount, m.ZarvoPelluxPostClient_GetTrajectory
        for _ in range(runs):
            keep("module_count", best(calls, 1, lambda: frame_count(client)))
            keep("module_trajectory", best(trajectory_calls, 1, lambda: get_trajectory(client, SUBJECT, MARKER)))
            raw = run_floor(program, "host", port, SUBJECT, MARKER, calls, 1, trajectory_calls)
            keep("host_count", raw["host_count"] * 1e-9)
            keep("host_trajectory", raw["host_trajectory"] * 1e-9)
            keep("pingpong", run_floor(program, "pingpong", COUNT_REQUEST, COUNT_REPLY, calls, 1)["pingpong"] * 1e-9)
            keep("bulk", run_floor(program, "bulk", TRAJECTORY_REQUEST, FRAMES, trajectory_calls, 1)["bulk"] * 1e-9)
            keep("python_socket", python_ping_pong(program, calls))
    finally:
        m.delete_ZarvoPelluxPostClient(client)

    # The raw client of the real host saw the frames that the floors imitate.
    seen = tuple(int(raw[name]) for name in ("count_request_frame", "count_reply_frame", "trajectory_request_frame",
                                             "trajectory_reply_frame"))
    expected = (HEADER + COUNT_REQUEST, HEADER + COUNT_REPLY, HEADER + TRAJECTORY_REQUEST, HEADER + TRAJECTORY_REPLY)
    if seen != expected:
        raise RuntimeError(f"the host's frames are {seen} bytes, the floors' {expected}")
    return figures


def main(argv=None):
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--quick", action="store_true", help="a few calls each, to check that the benchmark runs")
    options = parser.parse_args(argv)
    runs, calls, trajectory_calls = (2, 50, 2) if options.quick else (7, 20_000, 20)

    # The application is installed with the module, beside this interpreter's scripts (else on PATH).
    executable = shutil.which("client3-host", path=sysconfig.get_path("scripts")) or shutil.which("client3-host")
    if not executable:
        sys.exit("client3-host is not installed: install the package first (pip install .)")
    register_classes()
    with tempfile.TemporaryDirectory(prefix="bench_client") as folder:
        program = build_floor(folder)
        host, port = start([executable, "--port", "0", "--frames", str(FRAMES)])
        try:
            figures = measure(program, port, runs, calls, trajectory_calls)
        finally:
            stop(host)

    pingpong_floor = figures["pingpong"]
    print(f"GetFrameCount round trip: request frame {HEADER + COUNT_REQUEST} B, reply frame {HEADER + COUNT_REPLY} B;"
          f" best of {runs} runs of {calls} calls")
    print(f"  {'':44} {'us/call':>9} {'x C++ floor':>12}")
    rows = [
        ("C++ ping-pong, two threads (floor)", pingpong_floor),
        ("Python socket client, C++ server", figures["python_socket"]),
        ("raw C++ client, client3-host", figures["host_count"]),
        ("_Client3 GetFrameCount, client3-host", figures["module_count"]),
    ]
    for label, seconds in rows:
        print(f"  {label:<44} {seconds * 1e6:9.1f} {seconds / pingpong_floor:12.2f}")
    met = figures["module_count"] <= 1.5 * pingpong_floor
    print(f"  goal: _Client3 at most 1.50 x C++ floor: {'met' if met else 'missed'}")
    print()

    reply_bytes = HEADER + TRAJECTORY_REPLY
    bulk_floor = figures["bulk"]
    print(f"GetTrajectory, one marker over {FRAMES} frames: reply frame {reply_bytes:,} B;"
          f" best of {runs} runs of {trajectory_calls} calls")
    print(f"  {'':44} {'ms/call':>9} {'MB/s':>8} {'x C++ floor':>12}")
    rows = [
        ("C++ send + four std::vectors (floor)", bulk_floor),
        ("raw C++ client, client3-host", figures["host_trajectory"]),
        ("_Client3 GetTrajectory, client3-host", figures["module_trajectory"]),
    ]
    for label, seconds in rows:
        print(f"  {label:<44} {seconds * 1e3:9.3f} {reply_bytes / seconds / 1e6:8.0f} {seconds / bulk_floor:12.2f}")
    met = figures["module_trajectory"] <= 2 * bulk_floor
    print(f"  goal: _Client3 at most 2.00 x C++ floor: {'met' if met else 'missed'}")
    return 0


if __name__ == "__main__":
    sys.exit(main())
