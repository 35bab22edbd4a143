"""The type registry: descriptors, cast lists, registration of classes, instance initialisation,
pointer conversion, the lookups by name, and the type ring shared with a second module of the family."""
import ctypes
import gc
import random
import sys
import weakref

import pytest

import _Client3
import companion
from conftest import raises, run_python
from peer import build

CAPSULE = "swig_runtime_data4.type_pointer_capsulePelluxPostSDKClientPython3"
SAFE_STRING = "_p_ZarvoSDKClientCPP__SafeString"
TYPE_PARAMETER = "_p_ZarvoSDKClientCPP__Type_Parameter"
OUTPUT_RESULT = "_p_ZarvoSDKClientCPP__Output_Result"
VECTOR_DOUBLE = "_p_std__vectorT_double_std__allocatorT_double_t_t"
NO_SHADOW, DISOWN, IMPLICIT, NO_NULL = 2, 1, 2, 4


def record(name):
    return "_p_ZarvoSDKClientCPP__Output_" + name


# ---- Descriptors and cast lists -----------------------------------------------------------------


def test_records_of_many_kinds_pass_as_their_base_in_any_order(peer):
    """Each conversion through a cast moves its entry to the front of the base's list; every answer stays
    right, and the list keeps every entry once."""
    kinds = ["GetTrajectory", "GetFloat", "ReconstructSettings", "ProcessRequest", "GetObjectList", "Result"]
    records = {kind: peer.record(OUTPUT_RESULT if kind == "Result" else record(kind)) for kind in kinds}
    for number, kind in enumerate(kinds):
        _Client3.Output_Result_Result_set(records[kind], 100 + number)
    casts = sorted(peer.casts(OUTPUT_RESULT))
    orders = [kinds, kinds[::-1], kinds[:2] * 5, [k for k in kinds for _ in range(3)], kinds[::2] + kinds[1::2],
              random.Random(7).choices(kinds, k=300)]
    unrelated = _Client3.new_Type_Parameter()
    front = peer.casts(OUTPUT_RESULT)[0]
    for order in orders:
        for kind in order:
            assert _Client3.Output_Result_Result_get(records[kind]) == 100 + kinds.index(kind), kind
            if kind != "Result":  # an exact match leaves the list alone
                front = record(kind)
            assert peer.casts(OUTPUT_RESULT)[0] == front
        raises(TypeError, "in method 'Output_Result_Result_get', argument 1 of type 'ZarvoSDKClientCPP::Output_Result *'",
               _Client3.Output_Result_Result_get, unrelated)
    assert sorted(peer.casts(OUTPUT_RESULT)) == casts


# (object: a proxy made of a type given as [name], or a plain object; target; flags) -> code. There are
# no down-casts, and no target accepts any proxy.
@pytest.mark.parametrize("made, target, flags, code", [
    ([SAFE_STRING], TYPE_PARAMETER, 0, -1), ([OUTPUT_RESULT], record("GetFloat"), 0, -1),
    (["_p_ZarvoSDKClientCPP__ZarvoPelluxPostClient"], "_p_ZarvoSDKClientCPP__ZarvoClient", 0, 0),
    (["_p_ZarvoSDKClientCPP__VStringFactory"], "_p_ZarvoSDKClientCPP__IStringFactory", 0, 0), (["_p_int"], None, 0, 0),
    (object(), SAFE_STRING, 0, -1), (None, SAFE_STRING, 0, 0), (None, SAFE_STRING, NO_NULL, -13),
])
def test_conversion_results(peer, made, target, flags, code):
    made = peer.make(made[0], 0x2220, NO_SHADOW) if isinstance(made, list) else made
    address = 0x2220 if code == 0 and made is not None else None
    assert peer.convert(made, target, flags) == (code, address, 0)


@pytest.mark.parametrize("flags", [0, DISOWN])
def test_conversion_reports_and_moves_ownership(peer, flags):
    owning = _Client3.new_SafeString()
    assert peer.convert(owning, SAFE_STRING, flags) == (0, int(owning), 1) and owning.own() is (flags == 0)
    # A refused conversion leaves ownership alone, whatever the flags.
    again = _Client3.new_SafeString()
    assert peer.convert(again, TYPE_PARAMETER, DISOWN)[0] == -1 and again.own() is True
    assert peer.convert(peer.make(SAFE_STRING, 0x10, NO_SHADOW), SAFE_STRING, flags) == (0, 0x10, 0)  # borrowed


def test_this_attributes_and_proxy_chains_are_followed(peer):
    holder = type("Holder", (), {})
    proxy, inner, outer = _Client3.new_SafeString(), holder(), holder()
    inner.this, outer.this = proxy, inner
    assert peer.convert(outer, SAFE_STRING, 0)[:2] == (0, int(proxy)) and _Client3.SafeString_IsEmpty(outer) is True
    # The second proxy of a chain answers for a second type.
    proxy.append(peer.make(TYPE_PARAMETER, 0x3330, NO_SHADOW))
    assert peer.convert(outer, TYPE_PARAMETER, 0)[:2] == (0, 0x3330) and peer.convert(outer, VECTOR_DOUBLE, 0)[0] == -1
    broken = type("Broken", (), {"this": property(lambda self: {}["no proxy"])})()
    assert peer.convert(broken, SAFE_STRING, 0)[0] == -1
    raises(TypeError, "in method 'SafeString_IsEmpty', argument 1 of type 'ZarvoSDKClientCPP::SafeString const *'",
           _Client3.SafeString_IsEmpty, broken)


def test_implicit_conversion_builds_the_target_class(peer):
    made = peer.convert("abc", SAFE_STRING, IMPLICIT)
    assert made[0] == 512 and made[1]
    assert peer.convert("abc", SAFE_STRING, IMPLICIT, False)[0] == 0  # asked for its code only
    assert peer.convert(5, SAFE_STRING, IMPLICIT) == (-1, None, 0)  # the class refused it: no error kept
    assert peer.convert(None, SAFE_STRING, IMPLICIT) == (0, None, 0)
    assert peer.convert(5, "_p_int", IMPLICIT)[0] == -1  # no class registered


def test_objects_made_by_an_implicit_conversion_are_released(peer, safe_string_class):
    made = weakref.WeakSet()

    class Counted:
        """Made from a text: with a proxy of the target type, of another type, or of none."""

        def __init__(self, text):
            made.add(self)
            if text != "no proxy":
                self.this = peer.make(SAFE_STRING if text == "target" else TYPE_PARAMETER, 0x10, NO_SHADOW)

    _Client3.SafeString_swigregister(Counted)
    for text, code in (("target", 512), ("other type", -1), ("no proxy", -1)):
        for _ in range(50):
            assert peer.convert(text, SAFE_STRING, IMPLICIT)[0] == code
        gc.collect()
        assert len(made) == 0, text


# ---- Registration -------------------------------------------------------------------------------


@pytest.mark.parametrize("form", ["class", "tuple", "not a class"])
def test_swigregister_attaches_the_class(peer, safe_string_class, form):
    class Registered:
        def __init__(self):
            raise AssertionError("results are made without running __init__")

    factory = type("Factory", (), {})()  # not a class, but it has a __new__ of its own
    factory.__new__ = lambda owner: Registered.__new__(Registered)
    assert _Client3.SafeString_swigregister({"class": Registered, "tuple": (Registered,)}.get(form, factory)) is None
    result = peer.make(SAFE_STRING, 0x4440, 0)
    assert type(result) is Registered and type(result.this).__name__ == "SwigPyObject"
    assert int(result.this) == 0x4440 and result.this.own() is False


@pytest.mark.parametrize("args", [(), (object, object)])
def test_swigregister_argument_count(peer, args):
    before = type(peer.make(SAFE_STRING, 0x10, 0))
    raises(TypeError, "swigregister expected 1 arguments, got %d" % len(args), _Client3.SafeString_swigregister, args)
    assert type(peer.make(SAFE_STRING, 0x10, 0)) is before


def test_swiginit_stores_or_appends(peer):
    cls = companion.classes["SafeString"]
    instance, first, second = cls.__new__(cls), _Client3.new_SafeString(), peer.make(TYPE_PARAMETER, 0x6660, NO_SHADOW)
    assert _Client3.SafeString_swiginit(instance, first) is None and instance.__dict__ == {"this": first}
    assert _Client3.SafeString_swiginit(instance, second) is None and instance.this is first and first.next() is second
    # Through a "this" chain to the proxy.
    outer, third = cls.__new__(cls), _Client3.new_SafeString()
    outer.__dict__["this"] = instance
    assert _Client3.SafeString_swiginit(outer, third) is None and first.next() is third


def test_swiginit_refusals():
    instance = companion.classes["SafeString"]()
    kept = instance.this
    for count in (0, 1, 3):
        raises(TypeError, "swiginit expected 2 arguments, got %d" % count,
               _Client3.SafeString_swiginit, *[instance, _Client3.new_SafeString(), 1][:count])
    # A refused append answers None with the error pending.
    cause = pytest.raises(SystemError, _Client3.SafeString_swiginit, instance, 5).value.__cause__
    assert (type(cause), str(cause)) == (TypeError, "Attempt to append a non SwigPyObject")
    assert instance.this is kept and kept.next() is None
    for bare in (object(), int, 5):  # so does one on an instance without a dictionary
        assert pytest.raises(SystemError, _Client3.SafeString_swiginit, bare, _Client3.new_SafeString()).value.__cause__


# ---- Lookups by name ----------------------------------------------------------------------------


@pytest.mark.parametrize("text, found", [
    (VECTOR_DOUBLE, VECTOR_DOUBLE),
    ("std::vector<double> *", VECTOR_DOUBLE),
    ("  std::vector < double > * ", VECTOR_DOUBLE),
    ("INT32*", "_p_int"),
    ("std::vector< ZarvoSDKClientCPP::SafeString >::value_type *", SAFE_STRING),
    ("std::vector< double >", None),
    ("std::vector< double > **", None),
    ("", None),
    ("_p_nothing", None),
])
def test_type_query(peer, text, found):
    assert peer.query(text) == found and peer.query(text) == found  # the second answer from the cache
    assert (text in peer.cache()) is bool(found)


# ---- Bad input from other modules and scripts, in a fresh interpreter ------------------------------

REFUSED = "in method 'SafeString_IsEmpty', argument 1 of type 'ZarvoSDKClientCPP::SafeString const *'\n"


@pytest.mark.parametrize("script, output", [
    # A proxy may carry no descriptor; it is then accepted only where any type is.
    ("proxy = peer.make(None, 16, 2)\nassert peer.convert(proxy, None, 0) == (0, 16, 0)\n"
     "assert peer.convert(proxy, %r, 0)[0] == -1\ncheck(proxy)" % SAFE_STRING, REFUSED),
    # A registered class that cannot make instances: results cannot be made, and say so.
    ("_Client3.SafeString_swigregister(type(iter([])))\ntry:\n    peer.make(%r, 16, 0)\n"
     "except TypeError:\n    print('refused')" % SAFE_STRING, "refused\n"),
    # A chain of "this" attributes that loops back holds no proxy.
    ("class Loop: pass\nloop = Loop()\nloop.this = loop\ncheck(loop)", REFUSED),
    # A proxy chain that loops back (append can make one) is walked round once.
    ("proxy = _Client3.new_ZarvoPelluxPostClient()\nproxy.append(proxy)\ncheck(proxy)", REFUSED),
    ("first, second = _Client3.new_ZarvoPelluxPostClient(), _Client3.new_vectord()\n"
     "first.append(second)\nsecond.append(first)\ncheck(first)", REFUSED),
    # A "this" made afresh on every access is gone once looked at: it holds no proxy.
    ("class Fresh:\n    this = property(lambda self: peer.make(%r, 16, 0))\ncheck(Fresh())" % SAFE_STRING, REFUSED),
])
def test_bad_input_from_outside_does_not_crash(peer, script, output):
    check = "def check(o):\n    try:\n        _Client3.SafeString_IsEmpty(o)\n    except TypeError as e:\n        print(e)\n"
    rc, out, err = run_python("import _Client3\n" + build.import_lines(peer.__file__) + check + script)
    assert (rc, out, err) == (0, output, "")


# ---- The shared ring: a second module joins it; initialising again relinks nothing -------------


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
    ring = peer.ring()
    assert ring[:2] == [get(capsule, CAPSULE.encode()), peer.own_module()]
    # Behind the peer, only Client3's own second module, when Client3 has been imported.
    assert len(ring) == 2 + ("Client3._buffers" in sys.modules)
    # The peer uses the first module's descriptor of every type.
    for name in peer.names():
        head, used, own = peer.descriptor(name)
        assert head == used and used not in (0, own), name
    assert peer.proxy_type(_Client3.new_SafeString()) == peer.descriptor(SAFE_STRING)[0]


def test_proxies_cross_between_modules(peer):
    mine = _Client3.new_SafeString()
    theirs = peer.make(SAFE_STRING, int(mine), NO_SHADOW)
    assert type(theirs) is not type(mine) and type(theirs).__name__ == type(mine).__name__ == "SwigPyObject"
    assert theirs == mine and _Client3.SafeString_IsEmpty(theirs) is True
    assert mine.append(theirs) is None and mine.next() is theirs
    # A registration made through one module is seen by the other.
    assert type(peer.make(SAFE_STRING, int(mine), 0)) is companion.classes["SafeString"]


def test_initialising_again_relinks_nothing(peer):
    before = snapshot(peer)
    again = initialise_again(_Client3.__file__, "PyInit__Client3")
    assert again is not _Client3 and again.__name__ == "_Client3" and again.ExpectedOneFrame == 1006
    assert [n for n in vars(again) if not n.startswith("__")] == [n for n in vars(_Client3) if not n.startswith("__")]
    peer_again = [initialise_again(peer.__file__, "PyInit__Client3Peer") for _ in range(2)]
    assert all(module is not peer for module in peer_again) and snapshot(peer) == before
    # Conversions still work, through both modules and the new module objects.
    trajectory = peer.make("_p_ZarvoSDKClientCPP__Output_GetTrajectory", 0x1230, 2)
    assert peer_again[0].convert(trajectory, OUTPUT_RESULT, 0) == (0, 0x1230, 0)
    assert peer.casts(OUTPUT_RESULT)[0] == "_p_ZarvoSDKClientCPP__Output_GetTrajectory"
    made = again.new_SafeString()
    assert _Client3.SafeString_IsEmpty(made) is True and peer.proxy_type(made) == peer.descriptor(SAFE_STRING)[0]


# The peer loaded first owns the ring; _Client3 then joins it and uses the peer's descriptors.
PEER_FIRST = """
import _Client3
ring = peer.ring()
assert len(ring) == 2 and ring[0] == peer.own_module(), ring
assert all(len(set(peer.descriptor(name))) == 1 for name in peer.names())  # head's, used and own: one
made = _Client3.new_SafeString()
assert peer.proxy_type(made) == peer.descriptor({safe!r})[2]
casts = peer.casts({result!r})
assert sorted(casts) == [name for name in peer.names() if name.startswith("_p_ZarvoSDKClientCPP__Output_")], casts
_Client3.SafeString_swigregister(type("S", (), {{"__swig_destroy__": _Client3.delete_SafeString}}))
assert type(peer.make({safe!r}, int(made), 0)).__name__ == "S"
made.disown()
print("ok")
"""


def test_module_joins_a_ring_started_by_the_peer(peer):
    script = build.import_lines(peer.__file__) + PEER_FIRST.format(safe=SAFE_STRING, result=OUTPUT_RESULT)
    assert run_python(script) == (0, "ok\n", "")
