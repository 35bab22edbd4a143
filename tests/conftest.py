import ctypes
import gc
import os
import subprocess
import sys

import pytest

sys.path.insert(0, os.path.dirname(__file__))
# The long checks, which the suite runs bounded.
sys.path.insert(1, os.path.join(os.path.dirname(os.path.dirname(os.path.abspath(__file__))), "fuzz"))

import companion  # noqa: E402
import hostproc  # noqa: E402
from peer import build  # noqa: E402

# The package registers its own classes when it is first imported: imported here, before the suite's
# stand-in classes are registered, it never replaces them in the middle of a run.
hostproc.commands()


def _c_standard_output():
    """The C library, where the system lets Python open it by the null name (not on Windows)."""
    try:
        library = ctypes.CDLL(None)
        library.malloc.restype = ctypes.c_void_p
        return library, ctypes.c_void_p.in_dll(library, "stdout")
    except (OSError, AttributeError, ValueError, TypeError):
        return None, None


_C_LIBRARY, _C_STDOUT = _c_standard_output()
if _C_LIBRARY is not None:
    # The module writes its documented leak diagnostics through the C library's standard output, which
    # the interpreter leaves unbuffered under -u or PYTHONUNBUFFERED: a proxy that the garbage
    # collector frees between two tests would then print past the capture. Fully buffered (in a
    # buffer of its own that is never freed, since the C library flushes it at exit), they are
    # flushed at the end of a test and captured with its output.
    _BUFFER_SIZE = 1 << 16
    _C_LIBRARY.setvbuf(_C_STDOUT, ctypes.c_void_p(_C_LIBRARY.malloc(_BUFFER_SIZE)), 0, _BUFFER_SIZE)  # _IOFBF


@pytest.fixture(autouse=True)
def native_output():
    """Flushes the C library's standard output at the end of each test, into the test's capture."""
    yield
    if _C_LIBRARY is not None:
        _C_LIBRARY.fflush(None)


@pytest.fixture(scope="session", autouse=True)
def native_output_of_the_session():
    """What reference cycles still hold at the end of the run is freed, and its diagnostics captured,
    before the last test ends rather than at the interpreter's exit."""
    yield
    gc.collect()
    if _C_LIBRARY is not None:
        _C_LIBRARY.fflush(None)


@pytest.fixture(scope="session", autouse=True)
def registered_classes():
    """Every wrapped class registered, as a script that uses the module would have it."""
    return companion.register()


@pytest.fixture(scope="session")
def peer(tmp_path_factory):
    """The test-only second module of the family: it looks inside the runtime and makes objects as the library does."""
    return build.peer(tmp_path_factory.mktemp("peer"))


@pytest.fixture(scope="session")
def host(tmp_path_factory):
    """The demo application shared by the whole session, on a port of its own. Tests read from it;
    a test that changes the scene starts its own with `start_host`."""
    started = hostproc.start(log_path=tmp_path_factory.mktemp("host") / "host.log")
    yield started
    started.stop()


@pytest.fixture(scope="session", autouse=True)
def stopped_hosts():
    """Every application that a test asked to stop has ended when the session does."""
    yield
    hostproc.collect()


@pytest.fixture
def start_host(tmp_path):
    """Starts applications with extra options (`start_host("--fault", "garbage")`); each is asked to
    stop when the test ends. Their logs are host0.log, host1.log, ... in the test's tmp_path."""
    started = []

    def start(*options):
        started.append(hostproc.start(*options, log_path=tmp_path / f"host{len(started)}.log"))
        return started[-1]

    yield start
    for each in started:
        hostproc.stop_later(each)


@pytest.fixture
def clients():
    """Makes clients (hostproc.Client), connected (with address options) to a host when one is given;
    each is deleted after the test."""
    made = []

    def make(host=None, options=""):
        made.append(hostproc.Client(host, options))
        return made[-1]

    yield make
    for client in made:
        client.close()


@pytest.fixture
def frames():
    """The take length of `app`'s demo scene; a test module that wants another overrides it."""
    return 1000


@pytest.fixture
def app(start_host, frames):
    """A client of a demo application of the test's own."""
    client = hostproc.Client(start_host("--frames", str(frames)))
    yield client
    client.close()


@pytest.fixture
def companion_classes(registered_classes):
    """The Client3 package's classes for the test; the suite's own stand-in classes put back after it."""
    with companion.package_classes():
        yield


@pytest.fixture
def safe_string_class():
    """Lets a test register its own class for SafeString; the companion class is put back after.
    Garbage that earlier tests left in reference cycles is collected first, so that none of their
    SafeString proxies reaches the test's class."""
    gc.collect()
    yield
    companion._Client3.SafeString_swigregister(companion.classes["SafeString"])


# Memory figures mean nothing under the address sanitizer, whose allocator keeps what is freed.
SANITIZED = "libasan" in os.environ.get("LD_PRELOAD", "")
needs_plain_allocator = pytest.mark.skipif(SANITIZED, reason="the sanitizer's allocator holds on to freed memory")


def raises(exception, text, function, *args):
    """function(*args) must raise `exception` (that very class, when one is given) with exactly the message `text`."""
    with pytest.raises(exception) as caught:
        function(*args)
    assert str(caught.value) == text and (type(caught.value) is exception or isinstance(exception, tuple))
    return caught.value


def overload_text(name, *prototypes):
    """The message of an overloaded function that no overload accepts."""
    lines = "".join(f"    {p}\n" for p in prototypes)
    return f"Wrong number or type of arguments for overloaded function '{name}'.\n  Possible C/C++ prototypes are:\n{lines}"


def run_python(code):
    """Runs `code` in a fresh interpreter; returns (exit code, stdout, stderr)."""
    done = subprocess.run([sys.executable, "-c", code], capture_output=True, text=True, timeout=120)
    return done.returncode, done.stdout, done.stderr
