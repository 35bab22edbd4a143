"""Starting and stopping the application for tests of post-processing scripts.

    from Client3.testing import running_host

    with running_host(scene="demo", frames=500) as host:
        with Client3.connect(host.address, host.port) as client:
            ...

For pytest, name this module in a conftest.py (`pytest_plugins = ["Client3.testing"]`) and ask for
the `client3_host` fixture (a demo scene per test) or `client3_client` (a client connected to it).
"""
from __future__ import annotations

import subprocess
from contextlib import contextmanager
from typing import Any, Iterator, NamedTuple, Optional, Sequence

import Client3
from Client3.host import executable, listening_port, stop

STARTUP_SECONDS = 30


class Host(NamedTuple):
    """A running application: where it listens and its process."""

    address: str
    port: int
    process: "subprocess.Popen[str]"


@contextmanager
def running_host(
    scene: str = "demo", frames: Optional[int] = None, extra: Sequence[str] = (), address: str = "127.0.0.1",
    log: bool = True,
) -> Iterator[Host]:
    """Starts the application on a free loopback port with the given scene and take length, and
    stops it on exit. Its log goes to standard error, or nowhere when `log` is false."""
    command = [executable(), "--host", address, "--port", "0", "--scene", scene, *extra]
    if frames is not None:
        command += ["--frames", str(frames)]
    process = subprocess.Popen(command, stdout=subprocess.PIPE, stderr=None if log else subprocess.DEVNULL, text=True)
    try:
        assert process.stdout is not None
        first = process.stdout.readline()
        yield Host(address, listening_port(first), process)
    finally:
        stop(process)


@contextmanager
def connected(argv: Sequence[str] = ()) -> Iterator[Any]:
    """A client connected to the application at `argv`'s HOST and PORT when a script was given
    them, or else to an application of its own, started for the block and stopped after it."""
    if len(argv) >= 2:
        with Client3.connect(argv[0], int(argv[1])) as client:
            yield client
        return
    with running_host(log=False) as host, Client3.connect(host.address, host.port) as client:
        yield client


try:
    import pytest
except ImportError:  # pytest is needed only for the fixtures
    pass
else:

    @pytest.fixture
    def client3_host() -> Iterator[Host]:
        """A demo scene of its own for each test."""
        with running_host() as host:
            yield host

    @pytest.fixture
    def client3_client(client3_host: Host) -> Iterator[Any]:
        """A client connected to the test's own application; disconnected after the test."""
        with Client3.connect(client3_host.address, client3_host.port) as client:
            yield client
