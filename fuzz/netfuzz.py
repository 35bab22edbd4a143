"""A network fuzzer against a running host: random, mutated, truncated, oversized and slowly dripped
frames, half-closed connections, clients that never read their replies, and thousands of
connections opened and dropped. Throughout, the host keeps serving a well-behaved client, and its
memory and thread count stay bounded. Seeded, and bounded in rounds and time.

    python fuzz/netfuzz.py --rounds 100000 --seconds 3600 [--seed 1]   # the long run

The tests (tests/test_netfuzz.py) run 1,000 rounds."""
import argparse
import os
import random
import socket
import struct
import sys
import tempfile
import time

import _Client3 as m
import suitepath  # noqa: F401  (the suite's helpers, imported next)

import companion
import hostproc
from hostproc import (MAX_FRAME, Client, commands, frame, hello, int_value, read_frame, refusal, reply, request,
                      text_value, wait_until)

SEED = 20261123
DRIPPERS = 12     # connections that send their requests one byte a round
HOLDERS = 12      # connections that announce the largest frame and send only part of it
HELD_BYTES = 256 << 10
BURST = 30        # connections opened and dropped at once
CLIENTS = 64      # the host's default limit
FRAMES = 1000     # the demo take's


def close_with_reset(sock):
    """Closes `sock` so that its end resets the connection rather than ending it."""
    sock.setsockopt(socket.SOL_SOCKET, socket.SO_LINGER, struct.pack("ii", 1, 0))
    sock.close()


def host_status(host):
    """The host's resident memory in KiB and its thread count, from /proc."""
    with open(f"/proc/{host.process.pid}/status") as status:
        fields = dict(line.split(":", 1) for line in status)
    return int(fields["VmRSS"].split()[0]), int(fields["Threads"])


def shaken(host):
    """A connection that has shaken hands. Connections just dropped may still count against the
    host's limit of clients for a moment: a refusal for that is waited out, as a client would."""
    for _ in range(250):
        sock = hostproc.raw_connection(host)
        sock.sendall(hello())
        answer = read_frame(sock)
        if answer[:1] == b"H":
            return sock
        assert refusal(answer) == f"the application serves at most {CLIENTS} clients at once"
        sock.close()
        time.sleep(0.02)
    raise AssertionError("the host stayed full")


class Fuzzer:
    """One kind of bad peer per method; `rng` chooses what each sends."""

    def __init__(self, host, rng):
        self.host, self.rng = host, rng
        self.connections = 0
        # Requests of commands that only read the scene, for mutation.
        self.requests = [
            request(0, "GetMarkerNames", text_value("Alice")),
            request(0, "GetTrajectoryAtFrame", text_value("Bob"), text_value("LANK"), int_value(9)),
            request(0, "GetTrajectory", text_value("Alice"), text_value("C7")),
            request(0, "GetSubjectNames"),
        ]

    def open(self, shake=True):
        self.connections += 1
        return shaken(self.host) if shake else hostproc.raw_connection(self.host)

    def bytes(self, most):
        return bytes(self.rng.randrange(256) for _ in range(self.rng.randrange(1, most)))

    def close(self, sock):
        """Closes `sock`, half the time with a reset."""
        close_with_reset(sock) if self.rng.random() < 0.5 else sock.close()

    def garbage_before_hello(self):
        sock = self.open(shake=False)
        sock.sendall(self.bytes(200))
        self.close(sock)

    def frame_that_is_no_request(self):
        with self.open() as sock:
            sock.sendall(frame(bytes([self.rng.choice(b"HRE\x00\xff")]) + self.bytes(100)))
            assert refusal(read_frame(sock)) == "a frame that is not a request"
            assert read_frame(sock) is None

    def mutated_request(self):
        number = self.rng.randrange(1, 1 << 31)
        payload = bytearray(self.rng.choice(self.requests)[4:])
        payload[1:5] = struct.pack("<I", number)
        how = self.rng.randrange(3)
        if how == 0 and len(payload) > 7:
            payload[self.rng.randrange(7, len(payload))] ^= 1 << self.rng.randrange(8)
        elif how == 1 and len(payload) > 7:
            del payload[self.rng.randrange(7, len(payload)):]
        else:
            payload += self.bytes(40)
        with self.open() as sock:
            sock.sendall(frame(bytes(payload)))
            # Its message may quote the mutated text, which need not be UTF-8.
            answer = read_frame(sock)
            assert answer[:1] == b"R"
            got_number, code = struct.unpack_from("<Ii", answer, 1)
            assert got_number == number
            assert code in (m.Success, m.ApplicationError, m.InvalidFrameNumber)
            sock.sendall(request(number + 1, "GetFrameCount"))
            assert reply(read_frame(sock))[:2] == (number + 1, m.Success)

    def unknown_command(self):
        command = self.rng.randrange(len(commands()), 1 << 16)
        with self.open() as sock:
            sock.sendall(request(5, command, self.bytes(60)))
            assert reply(read_frame(sock)) == (5, m.ApplicationError, f"no command number {command}")

    def truncated(self):
        sent = self.rng.choice(self.requests)
        sock = self.open()
        sock.sendall(sent[:self.rng.randrange(1, len(sent))])
        self.close(sock)

    def oversized(self):
        size = self.rng.choice([0, MAX_FRAME + 1, self.rng.randrange(MAX_FRAME + 1, 1 << 32)])
        with self.open() as sock:
            sock.sendall(struct.pack("<I", size) + self.bytes(100))
            assert refusal(read_frame(sock)) == f"a frame may hold at most {MAX_FRAME} bytes"
            assert read_frame(sock) is None

    def half_closed(self):
        with self.open() as sock:
            sock.sendall(request(3, "GetMarkerNames", text_value("Bob")))
            sock.shutdown(socket.SHUT_WR)
            assert reply(read_frame(sock)) == (3, m.Success, "")
            assert read_frame(sock) is None

    def never_reads(self):
        # Asks for more than the connection holds and reads none of it: the host's send blocks until
        # the client goes.
        sock = self.open()
        sock.sendall(self.requests[2] * 60)
        self.close(sock)

    def burst(self):
        held = [self.open(shake=False) for _ in range(BURST)]
        for i, sock in enumerate(held):
            if i % 2:
                sock.sendall(hello()[:self.rng.randrange(1, 12)])
            close_with_reset(sock) if i % 3 == 0 else sock.close()

    KINDS = ["garbage_before_hello", "frame_that_is_no_request", "mutated_request", "unknown_command", "truncated",
             "oversized", "half_closed", "never_reads", "burst"]


class Dripper:
    """A connection that sends requests one byte a round, and reads each reply once it is all sent."""

    def __init__(self, sock):
        self.sock = sock
        self.number, self.left, self.answered = 0, b"", 0

    def drip(self):
        if not self.left:
            self.number += 1
            self.left = request(self.number, "GetMarkerNames", text_value("Alice"))
        self.sock.sendall(self.left[:1])
        self.left = self.left[1:]
        if not self.left:
            assert reply(read_frame(self.sock)) == (self.number, m.Success, "")
            self.answered += 1


def fuzz(host, rounds, seconds, seed):
    """Fuzzes `host` for `rounds` rounds (failing past `seconds`) and checks that it kept serving
    within bounds; returns its figures."""
    well = Client(host)
    markers = well.GetMarkerNames("Alice")
    rss_before, threads_before = host_status(host)
    rng = random.Random(seed)
    fuzzer = Fuzzer(host, rng)
    drippers = [Dripper(fuzzer.open()) for _ in range(DRIPPERS)]
    for i, dripper in enumerate(drippers):  # staggered, so that their frames end in different rounds
        for _ in range(i):
            dripper.drip()
    holders = [fuzzer.open() for _ in range(HOLDERS)]
    for sock in holders:
        sock.sendall(struct.pack("<I", MAX_FRAME) + b"Q" + bytes(HELD_BYTES))
    deadline = time.monotonic() + seconds
    rss_most, threads_most, written = 0, 0, {}
    for turn in range(1, rounds + 1):
        assert time.monotonic() < deadline, f"the fuzz took longer than {seconds} s"
        getattr(fuzzer, rng.choice(Fuzzer.KINDS))()
        for dripper in drippers:
            dripper.drip()
        if turn % 20 == 0:
            # The well-behaved client is served (a refusal fails the test); its writes are read back at the end.
            at = (turn // 20 - 1) % FRAMES + 1
            written[at] = float(turn)
            well.SetTrajectoryAtFrame("Bob", "RANK", at, float(turn), 0.0, 0.0, True)
            rss, threads = host_status(host)
            rss_most, threads_most = max(rss_most, rss), max(threads_most, threads)

    answered = sum(dripper.answered for dripper in drippers)
    assert answered >= DRIPPERS * (rounds // 25)
    for sock in [dripper.sock for dripper in drippers] + holders:
        sock.close()

    # A thread for each client, at most CLIENTS of them, besides the main thread; none left once they
    # are gone.
    assert threads_most <= CLIENTS + 1
    assert wait_until(lambda: host_status(host)[1] <= threads_before + 1, seconds=10)
    # Frames announced at the largest size cost only the bytes that came, not 64 MiB each.
    assert rss_most - rss_before < 64 << 10
    assert well.GetMarkerNames("Alice") == markers
    x = well.GetTrajectory("Bob", "RANK")[0]
    assert [x[at - 1] for at in written] == list(written.values())
    well.close()
    fresh = Client(host)
    assert fresh.GetFrameCount() == FRAMES
    fresh.close()
    return {"connections": fuzzer.connections, "answered drips": answered, "most threads": threads_most,
            "resident KiB before": rss_before, "resident KiB at most": rss_most}


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n\n")[0])
    parser.add_argument("--rounds", type=int, default=100_000)
    parser.add_argument("--seconds", type=float, default=3600)
    parser.add_argument("--seed", type=int, default=SEED)
    options = parser.parse_args()
    companion.register()
    with tempfile.TemporaryDirectory() as folder:
        host = hostproc.start(log_path=os.path.join(folder, "host.log"))
        try:
            figures = fuzz(host, options.rounds, options.seconds, options.seed)
        finally:
            host.stop()
    print(f"{options.rounds} rounds, seed {options.seed}: " + ", ".join(f"{k} {v}" for k, v in figures.items()))
    return 0


if __name__ == "__main__":
    sys.exit(main())
