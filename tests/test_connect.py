"""Why a Connect failed: each cause provoked for real on loopback, and the record's code and text
(the code's own text, then the address and port, then the cause). The application's own refusals
(its access token, its limit of clients) are in test_security.py and test_host.py."""
import contextlib
import socket
import sys

import pytest

import _Client3 as m
from hostproc import Client

# No resolver sends this name anywhere: a label has at most 63 octets.
TOO_LONG_A_LABEL = "x" * 64 + ".invalid"


def attempt(address, port):
    """The code and text of a new client's Connect, and whether the client is connected after it."""
    client = Client()
    try:
        return (*client.result("Connect", address, port), client.IsConnected())
    finally:
        client.close()


# ---- Places to connect to: each gives a host and a port; what it opens is closed after the test ----

def closed_port(stack, family=socket.AF_INET, host="127.0.0.1"):
    # A bound socket that does not listen refuses every connection to its port.
    sock = stack.enter_context(socket.socket(family))
    sock.bind((host, 0))
    return host, sock.getsockname()[1]


def closed_ipv6_port(stack):
    try:
        return closed_port(stack, socket.AF_INET6, "::1")
    except OSError:
        pytest.skip("no IPv6 loopback")


def unknown_name(stack):
    return TOO_LONG_A_LABEL, 8870


def silent_port(stack):
    # The system takes connections to a listening socket that nobody accepts from; nothing answers.
    sock = stack.enter_context(socket.create_server(("127.0.0.1", 0)))
    return "127.0.0.1", sock.getsockname()[1]


def full_backlog(stack):
    # Linux drops the connection requests that a full backlog cannot queue: they go unanswered.
    if not sys.platform.startswith("linux"):
        pytest.skip("how a full backlog answers is Linux's")
    listener = stack.enter_context(socket.socket())
    listener.bind(("127.0.0.1", 0))
    listener.listen(0)
    stack.enter_context(socket.create_connection(listener.getsockname()))
    return listener.getsockname()


@pytest.fixture
def place():
    with contextlib.ExitStack() as stack:
        yield lambda make: make(stack)


# (place, what follows the host in the address, the port (None: the place's), code, the cause)
CAUSES = [
    (closed_port, "", None, m.NotConnected, "refused the connection"),
    (closed_ipv6_port, "", None, m.NotConnected, "refused the connection"),
    (closed_port, "", 65536, m.NotConnected, "was not tried: a port is a number from 1 to 65535 (0 or less for 8870)"),
    (closed_port, "?timeout=2000&colour=red", None, m.NotConnected,
     "was not tried: 'colour' is not an address option (they are timeout=MS, connect=MS and token=TEXT)"),
    (closed_port, "?timeout=-5", None, m.NotConnected,
     "was not tried: the address option 'timeout' takes a whole number of milliseconds, not '-5'"),
    (closed_port, "?connect", None, m.NotConnected, "was not tried: the address option 'connect' has no value"),
    (unknown_name, "", None, m.NotConnected, "was not found: no host has that name"),
    (full_backlog, "?connect=300", None, m.NotConnected, "did not answer within 300 ms"),
    (silent_port, "?connect=300", None, m.NotConnected, "took the connection but did not answer within 300 ms"),
]


@pytest.mark.parametrize("make, options, port, code, cause", CAUSES,
                         ids=[f"{make.__name__}{options}" for make, options, *_ in CAUSES])
def test_a_failed_connect_keeps_its_code_and_says_where_and_why(place, make, options, port, code, cause):
    host, own_port = place(make)
    port = port or own_port
    where = f"[{host}]:{port}" if ":" in host else f"{host}:{port}"
    assert attempt(host + options, port) == (code, f"{m.ToString(code)} {where} {cause}", False)
