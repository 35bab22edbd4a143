"""The shared type ring: a second module of the family joins it, reuses this module's descriptors,
and running either module's initialisation again relinks nothing."""
import ctypes
import sys

import _Client3
import companion
from conftest import run_python
from peer import build

CAPSULE = "swig_runtime_data4.type_pointer_capsulePelluxPostSDKClientPython3"
SAFE_STRING = "_p_ZarvoSDKClientCPP__SafeString"
OUTPUT_RESULT = "_p_ZarvoSDKClientCPP__Output_Result"


def snapshot(peer):
    """The ring and every cast list, sorted (conversions reorder the lists; duplicates still show)."""
    return peer.ring(), {name: sorted(peer.casts(name)) for name in peer.names()}


def initialise_again(path, entry):
    function = getattr(ctypes.PyDLL(path), entry)
    function.restype = ctypes.py_object
    return function()


def test_peer_joins_the_ring_after_its_head(peer):
    """The first module publishes the capsule (read back under its exact name) and heads the ring."""
    get = ctypes.pythonapi.PyCapsule_GetPointer
    get.restype, get.argtypes = ctypes.c_void_p, [ctypes.py_object, ctypes.c_char_p]
    capsule = sys.modules["swig_runtime_data4"].type_pointer_capsulePelluxPostSDKClientPython3
    assert peer.ring() == [get(capsule, CAPSULE.encode()), peer.own_module()]
    # The peer uses the first module's descriptor of every type.
    for name in peer.names():
        head, used, own = peer.descriptor(name)
        assert head == used and used not in (0, own), name
    assert peer.proxy_type(_Client3.new_SafeString()) == peer.descriptor(SAFE_STRING)[0]


def test_proxies_cross_between_modules(peer):
    mine = _Client3.new_SafeString()
    theirs = peer.make(SAFE_STRING, int(mine), 2)
    assert type(theirs) is not type(mine) and type(theirs).__name__ == type(mine).__name__ == "SwigPyObject"
    assert theirs == mine and _Client3.SafeString_IsEmpty(theirs) is True
    mine.append(theirs)
    assert mine.next() is theirs
    # A registration made through one module is seen by the other.
    shadowed = peer.make(SAFE_STRING, int(mine), 0)
    assert type(shadowed) is companion.classes["SafeString"]


def test_initialising_again_relinks_nothing(peer):
    before = snapshot(peer)
    again = initialise_again(_Client3.__file__, "PyInit__Client3")
    assert again is not _Client3 and again.__name__ == "_Client3"
    assert [name for name in vars(again) if not name.startswith("__")] == [
        name for name in vars(_Client3) if not name.startswith("__")
    ]
    assert again.ExpectedOneFrame == 1006
    peer_again = [initialise_again(peer.__file__, "PyInit__Client3Peer") for _ in range(2)]
    assert all(module is not peer for module in peer_again)
    assert snapshot(peer) == before
    # Conversions still work, through both modules and the new module objects.
    trajectory = peer.make("_p_ZarvoSDKClientCPP__Output_GetTrajectory", 0x1230, 2)
    assert peer_again[0].convert(trajectory, OUTPUT_RESULT, 0) == (0, 0x1230, 0)
    assert peer.casts(OUTPUT_RESULT)[0] == "_p_ZarvoSDKClientCPP__Output_GetTrajectory"
    made = again.new_SafeString()
    assert _Client3.SafeString_IsEmpty(made) is True
    assert peer.proxy_type(made) == peer.descriptor(SAFE_STRING)[0]


# The peer loaded first owns the ring; _Client3 then joins it and uses the peer's descriptors.
PEER_FIRST = """
import _Client3
ring = peer.ring()
assert len(ring) == 2 and ring[0] == peer.own_module(), ring
for name in peer.names():
    head, used, own = peer.descriptor(name)
    assert head == used == own, name
made = _Client3.new_SafeString()
assert peer.proxy_type(made) == peer.descriptor({safe!r})[2]
casts = peer.casts({result!r})
assert len(casts) == len(set(casts)) == 42, casts
_Client3.SafeString_swigregister(type("S", (), {{"__swig_destroy__": _Client3.delete_SafeString}}))
assert type(peer.make({safe!r}, int(made), 0)).__name__ == "S"
made.disown()
print("ok")
"""


def test_module_joins_a_ring_started_by_the_peer(peer):
    rc, out, err = run_python(
        build.import_lines(peer.__file__) + PEER_FIRST.format(safe=SAFE_STRING, result=OUTPUT_RESULT)
    )
    assert (rc, out, err) == (0, "ok\n", "")
