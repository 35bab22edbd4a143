"""Client3._buffers and the NumPy side of the companion: views without copies, their lifetime, size changes
refused while a view is exported, filling from buffers with range checks, copies of vectorb and vectorss."""
import array
import ctypes
import gc
import struct
import sys
import weakref

import pytest

import _Client3
import Client3
from Client3 import _buffers
from conftest import run_python

np = pytest.importorskip("numpy")

TRAJECTORY = "_p_ZarvoSDKClientCPP__Output_GetTrajectory"

# name, format, NumPy type, values, a value to write
NUMERIC = [
    ("vectord", "d", np.float64, [1.5, -2.25, 3e300], 0.125),
    ("vectorf", "f", np.float32, [1.5, -2.25, 2.0**100], 0.125),
    ("vectori", "i", np.int32, [1, -2, 2**31 - 1], -(2**31)),
    ("vectorull", "Q", np.uint64, [1, 2, 2**64 - 1], 2**63),
]


@pytest.fixture(autouse=True)
def client3_classes(companion_classes):
    """Client3's classes for every test of this file."""


@pytest.fixture
def trajectory(peer):
    """A trajectory record owned by its proxy, with three frames."""
    return make_trajectory(peer)


def make_trajectory(peer):
    record = peer.record(TRAJECTORY)
    record.X, record.Y, record.Z = (Client3.vectord(values) for values in ([1.0, 2.0, 3.0], [4.0, 5.0, 6.0], [7.0, 8.0, 9.0]))
    record.E = Client3.vectorb([True, False, True])
    return record


@pytest.mark.parametrize("name, format, dtype, values, written", NUMERIC)
def test_a_view_shows_the_vectors_own_storage_both_ways(name, format, dtype, values, written):
    vector = getattr(Client3, name)(values)
    view = vector.view()
    assert (view.format, view.itemsize, view.readonly, view.tolist()) == (format, np.dtype(dtype).itemsize, False, values)
    view[0] = written
    assert getattr(_Client3, name + "___getitem__")(vector, 0) == written
    getattr(_Client3, name + "___setitem__")(vector, 1, written)
    assert view[1] == written


def test_a_view_keeps_the_vector_alive():
    vector = Client3.vectord([float(i) for i in range(1000)])
    gone = weakref.ref(vector)
    view = vector.view()
    del vector
    gc.collect()
    assert gone() is not None
    assert view[999] == 999.0
    view.release()
    gc.collect()
    assert gone() is None


def test_a_field_view_keeps_the_record_alive(peer):
    trajectory = make_trajectory(peer)
    record = weakref.ref(trajectory)
    x = trajectory.X.view()
    del trajectory
    gc.collect()
    assert record() is not None
    filler = [Client3.vectord([9.0] * 3) for _ in range(100)]  # reuses freed memory, were the record gone
    assert x.tolist() == [1.0, 2.0, 3.0]
    del x, filler
    gc.collect()
    assert record() is None


def test_the_export_count_follows_every_buffer():
    vector = Client3.vectord([1.0, 2.0])
    first, second = vector.view(), vector.view()
    array_ = np.asarray(vector)
    assert _buffers.exports(vector) == 3
    first.release()
    del array_
    assert _buffers.exports(vector) == 1
    second.release()
    assert _buffers.exports(vector) == 0
    assert not _buffers.exporting()


RESIZING = {
    "append": lambda v, other: v.append(1.0),
    "extend": lambda v, other: v.extend([1.0]),
    "+=": lambda v, other: v.__iadd__([1.0]),
    "resize": lambda v, other: v.resize(10),
    "pop at an index": lambda v, other: v.pop(0),
    "remove": lambda v, other: v.remove(1.0),
    "del item": lambda v, other: v.__delitem__(0),
    "growing slice": lambda v, other: v.__setitem__(slice(0, 1), [1.0, 2.0]),
    "__delslice__": lambda v, other: v.__delslice__(0, 1),
    "swapped into": lambda v, other: other.swap(v),
    "fill to another size": lambda v, other: v.fill(np.zeros(5)),
}


@pytest.mark.parametrize("operation", RESIZING.values(), ids=RESIZING.keys())
def test_size_changes_are_refused_while_a_view_is_exported(operation):
    vector, other = Client3.vectord([1.0, 2.0, 3.0]), Client3.vectord([4.0])
    view = vector.view()
    with pytest.raises(BufferError, match="while 1 view of it is exported"):
        operation(vector, other)
    assert list(vector) == [1.0, 2.0, 3.0] and list(other) == [4.0]
    view.release()
    operation(vector, other)


def test_a_field_is_not_replaced_while_a_view_of_it_is_exported(trajectory):
    x = np.asarray(trajectory.X)
    with pytest.raises(BufferError):
        trajectory.X = Client3.vectord([1.0])
    trajectory.Y = Client3.vectord([1.0])  # another field of the record
    assert list(trajectory.X) == [1.0, 2.0, 3.0]
    del x
    trajectory.X = Client3.vectord([1.0])
    assert list(trajectory.X) == [1.0]


IN_PLACE = {
    "item": lambda v: v.__setitem__(0, 7.0),
    "extended slice": lambda v: v.__setitem__(slice(None, None, 2), [7.0, 9.0]),
    "fill from the view itself": lambda v: v.fill(v.view()),
}


@pytest.mark.parametrize("operation", IN_PLACE.values(), ids=IN_PLACE.keys())
def test_changes_in_place_are_seen_through_an_exported_view(operation):
    vector = Client3.vectord([1.0, 2.0, 3.0])
    view = vector.view()
    operation(vector)
    assert view.tolist() == list(vector)


# target, source, expected contents
FILLED = [
    ("vectord", np.array([0.5, -1e300]), [0.5, -1e300]),
    ("vectord", np.array([0.5, 2.0], dtype=np.float32), [0.5, 2.0]),
    ("vectord", np.array([1.0, 2.0]).tobytes(), [1.0, 2.0]),
    ("vectord", np.zeros((2, 2)), [0.0] * 4),
    ("vectorf", np.array([0.5, -3.4e38]), [0.5, float(np.float32(-3.4e38))]),
    ("vectorf", np.array([np.inf, -np.inf]), [float("inf"), float("-inf")]),
    ("vectori", np.array([2**31 - 1, -(2**31)], dtype=np.int64), [2**31 - 1, -(2**31)]),
    ("vectori", np.array([-128, 127], dtype=np.int8), [-128, 127]),
    ("vectori", np.array([2**31 - 1], dtype=np.uint32), [2**31 - 1]),
    ("vectori", np.array([2**31 - 1], dtype=np.uint64), [2**31 - 1]),
    ("vectorull", np.array([2**64 - 1], dtype=np.uint64), [2**64 - 1]),
    ("vectorull", np.array([2**63 - 1, 0], dtype=np.int64), [2**63 - 1, 0]),
    ("vectorull", array.array("H", [7]), [7]),
    ("vectorb", np.array([True, False, True]), [True, False, True]),
]


@pytest.mark.parametrize("name, source, expected", FILLED)
def test_fill_converts_every_matching_source(name, source, expected):
    vector = getattr(Client3, name)(6)
    vector.fill(source)
    assert list(vector) == expected
    assert list(getattr(Client3, name).from_buffer(source)) == expected


# target, source, error, message
REFUSED = [
    ("vectori", np.array([2**31], dtype=np.int64), OverflowError, r"element 0 \(2147483648\) is out of range for vectori"),
    ("vectori", np.array([0, -(2**31) - 1], dtype=np.int64), OverflowError, r"element 1 \(-2147483649\) is out"),
    ("vectori", np.array([2**31], dtype=np.uint32), OverflowError, r"element 0 \(2147483648\)"),
    ("vectori", np.array([2**63], dtype=np.uint64), OverflowError, r"element 0 \(9223372036854775808\)"),
    ("vectorull", np.array([5, -1], dtype=np.int64), OverflowError, r"element 1 \(-1\) is out of range for vectorull"),
    ("vectorf", np.array([1.0, 3.5e38]), OverflowError, r"element 1 \(3\.5e\+38\) is out of range for vectorf"),
    ("vectorf", np.array([-1e39]), OverflowError, r"element 0"),
    ("vectord", np.array([1, 2], dtype=np.int64), TypeError, r"a vectord cannot be filled from a buffer of format 'l'"),
    ("vectori", np.array([1.0]), TypeError, r"format 'd'"),
    ("vectorb", np.array([1], dtype=np.int8), TypeError, r"format 'b'"),
    ("vectord", np.array([1.0], dtype=">f8"), TypeError, r"format '>d'"),
    ("vectord", b"\x00" * 12, ValueError, r"12 bytes are not a whole number of 8-byte elements of vectord"),
    ("vectorss", b"", TypeError, r"a vectorss holds texts"),
    ("vectord", [1.0, 2.0], TypeError, r"bytes-like"),
    ("vectord", np.arange(4.0)[::2], (ValueError, BufferError, TypeError), r"contiguous"),
]


@pytest.mark.parametrize("name, source, error, message", REFUSED)
def test_fill_refuses_and_leaves_the_vector_unchanged(name, source, error, message):
    vector = getattr(Client3, name)({"vectorss": ["x", "y"], "vectorb": [True, False]}.get(name, [1, 2]))
    before = [str(element) for element in vector]
    with pytest.raises(error, match=message):
        vector.fill(source)
    assert [str(element) for element in vector] == before


class Buffer(ctypes.Structure):
    """A Py_buffer, as C consumers and exporters see it."""

    _fields_ = [("buf", ctypes.c_void_p), ("obj", ctypes.c_void_p), ("len", ctypes.c_ssize_t),
                ("itemsize", ctypes.c_ssize_t), ("readonly", ctypes.c_int), ("ndim", ctypes.c_int),
                ("format", ctypes.c_char_p), ("shape", ctypes.POINTER(ctypes.c_ssize_t)),
                ("strides", ctypes.POINTER(ctypes.c_ssize_t)), ("suboffsets", ctypes.c_void_p),
                ("internal", ctypes.c_void_p)]


def c_function(name, result, *arguments):
    function = getattr(ctypes.PyDLL(None), name)
    function.restype, function.argtypes = result, list(arguments)
    return function


GET_BUFFER = c_function("PyObject_GetBuffer", ctypes.c_int, ctypes.py_object, ctypes.POINTER(Buffer), ctypes.c_int)
RELEASE_BUFFER = c_function("PyBuffer_Release", None, ctypes.POINTER(Buffer))
MEMORYVIEW_FROM_BUFFER = c_function("PyMemoryView_FromBuffer", ctypes.py_object, ctypes.POINTER(Buffer))


# What a consumer asks for (PyBUF_SIMPLE, _FORMAT, _ND, _STRIDES, _STRIDES | _FORMAT) -> the format,
# the length of the one dimension and its stride that the buffer then describes.
@pytest.mark.parametrize("flags, described", [
    (0x0, (None, None, None)),
    (0x4, (b"d", None, None)),
    (0x8, (None, 3, None)),
    (0x18, (None, 3, 8)),
    (0x1C, (b"d", 3, 8)),
])
def test_the_exporter_describes_what_a_c_consumer_asks_for(flags, described):
    view = Client3.vectord([1.0, 2.0, 3.0]).view()
    buffer = Buffer()
    assert GET_BUFFER(view.obj, ctypes.byref(buffer), flags) == 0
    try:
        shape = buffer.shape[0] if buffer.shape else None
        stride = buffer.strides[0] if buffer.strides else None
        assert (buffer.format, shape, stride) == described
        assert (buffer.len, buffer.itemsize, buffer.ndim, buffer.readonly) == (24, 8, 1, 0)
    finally:
        RELEASE_BUFFER(ctypes.byref(buffer))
        view.release()


@pytest.mark.skipif(sys.byteorder != "little", reason="the network byte order is the machine's own")
def test_a_buffer_in_the_network_byte_order_is_refused():
    """No Python object exports the '!' order, but a C library's exporter may."""
    data = (ctypes.c_char * 16).from_buffer_copy(struct.pack("!dd", 1.5, 2.5))
    shape, stride = (ctypes.c_ssize_t * 1)(2), (ctypes.c_ssize_t * 1)(8)
    described = Buffer(buf=ctypes.addressof(data), len=16, itemsize=8, readonly=1, ndim=1, format=b"!d",
                       shape=shape, strides=stride)
    vector = Client3.vectord([0.0, 0.0])
    with pytest.raises(TypeError, match="from a buffer of format '!d'"):
        vector.fill(MEMORYVIEW_FROM_BUFFER(ctypes.byref(described)))
    assert list(vector) == [0.0, 0.0]


@pytest.mark.parametrize("function", [_buffers.view, _buffers.copy, _buffers.exports, lambda v: _buffers.fill(v, b"")])
def test_the_bridge_refuses_what_is_not_a_vector(function):
    with pytest.raises(TypeError, match="must be a"):
        function(Client3.SafeString("x"))


@pytest.mark.parametrize("name, values, dtype", [("vectorb", [True, False, True], np.bool_), ("vectorss", ["a", "é", ""], np.str_)])
def test_vectorb_and_vectorss_become_arrays_only_as_copies(name, values, dtype):
    vector = getattr(Client3, name)(values)
    copied = np.asarray(vector)
    assert copied.dtype.type is dtype and copied.tolist() == values
    copied[0] = copied[1]
    assert list(vector) == values
    with pytest.raises(TypeError, match="no contiguous storage"):
        vector.view()
    with pytest.raises(ValueError, match="only as a copy"):
        vector.__array__(copy=False)


def test_copy_of_a_vector_is_independent():
    vector = Client3.vectorull([1, 2**64 - 1])
    copied = _buffers.copy(vector)
    assert (copied.format, copied.tolist()) == ("Q", [1, 2**64 - 1])
    copied[0] = 5
    assert vector[0] == 1 and _buffers.exports(vector) == 0


def test_a_trajectory_gives_its_four_fields_as_arrays(trajectory):
    x, y, z, e = trajectory.arrays()
    assert [a.dtype for a in (x, y, z, e)] == [np.float64] * 3 + [np.bool_]
    assert (x.tolist(), y.tolist(), z.tolist(), e.tolist()) == ([1.0, 2.0, 3.0], [4.0, 5.0, 6.0], [7.0, 8.0, 9.0], [True, False, True])
    x[0] = 10.0
    assert trajectory.X[0] == 10.0


def test_numpy_stays_optional():
    code = (
        "import sys\n"
        "import Client3\n"
        "print('numpy' in sys.modules)\n"
        "sys.modules['numpy'] = None\n"
        "vector = Client3.vectord.from_buffer(bytes(16))\n"
        "vector.view()[1] = 2.5\n"
        "print(list(vector))\n"
        "try:\n"
        "    vector.__array__()\n"
        "except ImportError:\n"
        "    print('no numpy')\n"
    )
    status, out, err = run_python(code)
    assert status == 0, err
    assert out.split("\n")[:3] == ["False", "[0.0, 2.5]", "no numpy"]

