"""A first session with the application: connect, and print an account of the scene.

    python examples/session.py                 # starts its own application on a free port
    python examples/session.py HOST PORT       # uses a running one

Every operation answers with a record whose Result is 0 (Success) or a code whose text
ToString gives; failures inside the application are reported there, never raised.
"""
import subprocess
import sys

import _Client3 as m


def register_classes():
    """Gives every wrapped class a script class that frees what its proxies own."""
    for name in dir(m):
        if name.endswith("_swigregister"):
            cls = name[: -len("_swigregister")]
            destroy = getattr(m, "delete_" + cls, None)
            getattr(m, name)(type(cls, (), {"__swig_destroy__": destroy} if destroy else {}))


def text(safe_string):
    return m.SafeString_Value(safe_string)


def strings(vector):
    return [text(m.vectorss___getitem__(vector, i)) for i in range(m.vectorss___len__(vector))]


def check(record):
    """Stops the session with the application's message when a call failed."""
    code = m.Output_Result_Result_get(record)
    if code != m.Success:
        sys.exit(f"failed ({code}): {text(m.Output_Result_ResultString_get(record))}")
    return record


def start_host():
    """Starts the application on a free loopback port; returns the process and its port."""
    host = subprocess.Popen(["client3-host", "--port", "0"], stdout=subprocess.PIPE, stderr=subprocess.DEVNULL, text=True)
    first = host.stdout.readline()  # "listening on 127.0.0.1:PORT"
    return host, int(first.rsplit(":", 1)[1])


def account(client):
    info = check(m.ZarvoPelluxPostClient_PSL(client, "GetServerInfo"))
    server = dict(line.split("=", 1) for line in text(m.Output_GetString_Str_get(info)).splitlines())
    print(f"{server['Program']} {server['MajorVersion']}.{server['MinorVersion']}.{server['PointVersion']}")

    scene = check(m.ZarvoPelluxPostClient_GetSceneName(client))
    frames = m.ZarvoPelluxPostClient_GetFrameCount(client)
    print(f"scene '{text(m.Output_GetSceneName_Name_get(scene))}', frames 1 to {frames}")

    subjects = check(m.ZarvoPelluxPostClient_GetSubjectNames(client))
    for subject in strings(m.Output_GetSubjectNames_Names_get(subjects)):
        markers = check(m.ZarvoPelluxPostClient_GetMarkerNames(client, subject))
        print(f"subject {subject}:")
        for marker in strings(m.Output_GetMarkerNames_Names_get(markers)):
            trajectory = check(m.ZarvoPelluxPostClient_GetTrajectory(client, subject, marker))
            seen = m.Output_GetTrajectory_E_get(trajectory)
            flags = [m.vectorb___getitem__(seen, i) for i in range(m.vectorb___len__(seen))]
            gaps = sum(1 for i, e in enumerate(flags) if not e and (i == 0 or flags[i - 1]))
            print(f"  {marker:<6} seen in {sum(flags):5d} frames, {gaps} gap(s)")

    trajectory = check(m.ZarvoPelluxPostClient_GetTrajectory(client, "Alice", "LANK"))
    x = m.Output_GetTrajectory_X_get(trajectory)
    print(f"Alice's LANK travels from x = {m.vectord_front(x):.0f} mm to x = {m.vectord_back(x):.0f} mm")


def main(argv):
    register_classes()
    host = None
    if len(argv) == 3:
        address, port = argv[1], int(argv[2])
    else:
        host, port = start_host()
        address = "127.0.0.1"
    client = m.new_ZarvoPelluxPostClient()
    try:
        check(m.ZarvoPelluxPostClient_Connect(client, address, port))
        account(client)
    finally:
        m.delete_ZarvoPelluxPostClient(client)
        if host:
            host.terminate()
            host.wait()


if __name__ == "__main__":
    main(sys.argv)
