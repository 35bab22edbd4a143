"""Writes the fuzz targets' seed corpus (fuzz/corpus/) from real frames: a recording relay sits
between the client library and a demo host, and a few operations of each kind go through it.

    python fuzz/seeds.py

host/    each request payload the library sent
library/ each reply payload, behind the selector byte of fuzz/library.cpp's operation that reads it
         (0x40 marks the hello reply)"""
import hashlib
import multiprocessing
import os
import socket
import struct
import threading

import Client3
from Client3.testing import running_host

HERE = os.path.dirname(os.path.abspath(__file__))

# The operations of fuzz/library.cpp's Call, in its order: their replies are the library's seeds.
LIBRARY_CALLS = [
    lambda c: c.GetFrameCount(),
    lambda c: c.GetCommandList(),
    lambda c: c.GetCommandInfo("GetTrajectory"),
    lambda c: c.ProcessRequest("GetMarkerNames", PARAMETERS[0]),
    lambda c: c.GetSubjectNames(),
    lambda c: c.GetTrajectory("Alice", "LANK"),
    lambda c: c.GetTrajectoryAtFrame("Alice", "LANK", 1),
    lambda c: c.GetSubjectParamDetails("Alice", "", "Height"),
    lambda c: c.GetConstraintDetails("Alice", "", "C1"),
    lambda c: c.SceneGetObjectList("Marker"),
    lambda c: c.ObjectGetAttributeValue(1, "Translation"),
    lambda c: c.ObjectGetAttributes(1),
    lambda c: c.TimelineGetSelectedRanges(),
    lambda c: c.TimelineGetFrameRate(),
    lambda c: c.OfflineGetReconstructSettings(),
    lambda c: c.OfflineGetLabelingSubjectCalibrationSettings(),
]

# The parameter list that ProcessRequest sends, read from the application before the calls.
PARAMETERS = []

# Requests of other shapes, for the host: setters, arrays, requests by name, filters.
HOST_CALLS = [
    lambda c: c.SetTrajectory("Alice", "LANK", Client3.vectord([1.0] * 3), Client3.vectord([2.0] * 3),
                              Client3.vectord([3.0] * 3), Client3.vectorb([True, False, True])),
    lambda c: c.SetTrajectoryAtFrame("Alice", "LANK", 2, 1.0, 2.0, 3.0, True),
    lambda c: c.PSL("GetMarkerNames SubjectName=Alice"),
    lambda c: c.Log("info", "seed"),
    lambda c: c.SceneCreateObject("Null", "Extra", 1, ""),
    lambda c: c.ObjectSetAttributeValue(1, "Name", "Renamed"),
    lambda c: c.ChannelGetValue(1, 1, 1, 5, 0, ""),
    lambda c: c.ChannelGetGaps(1, 1, 0),
    lambda c: c.ParameterCreate(1, "P", 0),
    lambda c: c.TimelineSelectRange(1, 10, 0),
    lambda c: c.TimelineSetFrameRate(50.0),
    lambda c: c.OfflineFixOcclusion("Alice", ""),
    lambda c: c.OfflineSetOcclusionFixingSettings(c.OfflineGetOcclusionFixingSettings()),
    lambda c: c.FilterApplyFIR(1, 1, "Translation", True, 5, 10.0, 20.0, 100.0),
    lambda c: c.FilterApplyWeightedAverage(1, 1, "Translation", False, 3, 1),
]


def relay(target, pipe):
    """Forwards one connection to the host on port `target` and sends back through `pipe` its port
    first, then every frame in order, per direction. It runs in a process of its own: the client
    holds the interpreter while it waits for a reply."""
    listener = socket.create_server(("127.0.0.1", 0))
    pipe.send(listener.getsockname()[1])
    client, _ = listener.accept()
    host = socket.create_connection(("127.0.0.1", target))
    requests, replies = [], []
    forward = threading.Thread(target=pump, args=(client, host, requests))
    forward.start()
    pump(host, client, replies)
    forward.join()
    pipe.send((requests, replies))


def pump(source, sink, frames):
    with source.makefile("rb") as stream:
        while True:
            header = stream.read(4)
            if len(header) < 4:
                sink.shutdown(socket.SHUT_WR)
                return
            payload = stream.read(struct.unpack("<I", header)[0])
            frames.append(payload)
            sink.sendall(header + payload)


def write(folder, data):
    os.makedirs(folder, exist_ok=True)
    with open(os.path.join(folder, hashlib.sha1(data).hexdigest()[:16]), "wb") as out:
        out.write(data)


def main():
    with running_host(frames=20, log=False) as host:
        ours, theirs = multiprocessing.Pipe()
        relaying = multiprocessing.Process(target=relay, args=(host.port, theirs))
        relaying.start()
        client = Client3.connect("127.0.0.1?timeout=5000", ours.recv())
        PARAMETERS.append(client.GetCommandInfo("GetMarkerNames").InputParameters)
        for call in LIBRARY_CALLS + HOST_CALLS:
            call(client)
        client.Disconnect()
        requests, replies = ours.recv()
        relaying.join()
    hello, replies = replies[0], replies[2:]
    write(os.path.join(HERE, "corpus", "library"), b"\x40" + hello)
    for selector, reply in enumerate(replies[:len(LIBRARY_CALLS)]):
        write(os.path.join(HERE, "corpus", "library"), bytes([selector]) + reply)
    for request in requests:
        write(os.path.join(HERE, "corpus", "host"), request)


if __name__ == "__main__":
    main()
