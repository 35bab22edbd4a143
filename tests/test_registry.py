"""The type registry: descriptors, cast lists, registration of classes, instance initialisation,
pointer conversion and the lookups by name."""
import ctypes

import pytest

import _Client3
import companion
from conftest import run_python
from peer import build

SAFE_STRING = "_p_ZarvoSDKClientCPP__SafeString"
TYPE_PARAMETER = "_p_ZarvoSDKClientCPP__Type_Parameter"
OUTPUT_RESULT = "_p_ZarvoSDKClientCPP__Output_Result"
VECTOR_DOUBLE = "_p_std__vectorT_double_std__allocatorT_double_t_t"
NO_SHADOW, OWN = 2, 1
DISOWN, IMPLICIT, NO_NULL = 1, 2, 4
DERIVED_RECORDS = """ProcessRequest GetServerInfo GetCommandList GetCommandInfo GetSceneName GetSubjectNames
    GetMarkerNames HasTrajectory GetTrajectory GetTrajectoryAtFrame GetBoneNames GetRootBone GetBoneDetails
    GetConstraintNames GetConstraintDetails GetSubjectParamNames GetSubjectParamDetails GetObject GetObjectList
    GetIntegerList GetString GetAttribute GetStringList GetInteger GetUnsignedLong GetUnsignedLongList GetFloat
    GetTakeInfo GetJointDetails GetJointNames GetRootSegment GetSegmentDetails GetSegmentNames GetTrialName
    CircleFitSettings ReconstructSettings LabelingSettings OcclusionFixingSettings SolvingSettings
    LabelingSubjectCalibrationSettings LabelROMSettings""".split()


def record(name):
    return "_p_ZarvoSDKClientCPP__Output_" + name


@pytest.fixture
def safe_string_class():
    """Lets a test register its own class for SafeString; the companion class is put back after."""
    yield
    _Client3.SafeString_swigregister(companion.classes["SafeString"])


# ---- Descriptors and cast lists -----------------------------------------------------------------


def test_descriptor_table_is_sorted_and_every_name_is_found(peer):
    names = peer.names()
    assert len(names) == len(set(names)) == 84
    assert names == sorted(names, key=str.encode)
    for name in names:
        head, used, _ = peer.descriptor(name)
        assert head == used != 0, name


@pytest.mark.parametrize(
    "target, sources",
    [
        (OUTPUT_RESULT, {OUTPUT_RESULT} | {record(name) for name in DERIVED_RECORDS}),
        ("_p_ZarvoSDKClientCPP__ZarvoClient", {"_p_ZarvoSDKClientCPP__ZarvoClient", "_p_ZarvoSDKClientCPP__ZarvoPelluxPostClient"}),
        ("_p_ZarvoSDKClientCPP__IStringFactory", {"_p_ZarvoSDKClientCPP__IStringFactory", "_p_ZarvoSDKClientCPP__VStringFactory"}),
    ],
)
def test_cast_lists_of_base_types(peer, target, sources):
    casts = peer.casts(target)
    assert len(casts) == len(set(casts)) == len(sources)
    assert set(casts) == sources


def test_every_other_descriptor_accepts_only_itself(peer):
    bases = {OUTPUT_RESULT, "_p_ZarvoSDKClientCPP__ZarvoClient", "_p_ZarvoSDKClientCPP__IStringFactory"}
    assert {name: peer.casts(name) for name in peer.names() if name not in bases} == {
        name: [name] for name in peer.names() if name not in bases
    }


def test_conversion_through_a_cast_moves_the_entry_to_the_front(peer):
    trajectory = peer.make(record("GetTrajectory"), 0x1230, NO_SHADOW)
    floating = peer.make(record("GetFloat"), 0x4560, NO_SHADOW)
    assert peer.convert(trajectory, OUTPUT_RESULT, 0) == (0, 0x1230, 0)
    assert peer.casts(OUTPUT_RESULT)[0] == record("GetTrajectory")
    assert peer.convert(floating, OUTPUT_RESULT, 0) == (0, 0x4560, 0)
    casts = peer.casts(OUTPUT_RESULT)
    assert casts[:2] == [record("GetFloat"), record("GetTrajectory")]
    assert len(casts) == len(set(casts)) == 42
    # An exact match does not touch the list.
    base = peer.make(OUTPUT_RESULT, 0x7890, NO_SHADOW)
    assert peer.convert(base, OUTPUT_RESULT, 0) == (0, 0x7890, 0)
    assert peer.casts(OUTPUT_RESULT) == casts


# (object made as (type, flags) or a plain object, target, flags) -> code
@pytest.mark.parametrize(
    "made, target, flags, code",
    [
        ((SAFE_STRING, 0), TYPE_PARAMETER, 0, -1),
        ((OUTPUT_RESULT, 0), record("GetFloat"), 0, -1),  # no down-casts
        (("_p_ZarvoSDKClientCPP__ZarvoPelluxPostClient", 0), "_p_ZarvoSDKClientCPP__ZarvoClient", 0, 0),
        (("_p_ZarvoSDKClientCPP__VStringFactory", 0), "_p_ZarvoSDKClientCPP__IStringFactory", 0, 0),
        (("_p_int", 0), None, 0, 0),  # no target: any proxy
        (5, SAFE_STRING, 0, -1),
        ("text", SAFE_STRING, 0, -1),
        (object(), SAFE_STRING, 0, -1),
        (None, SAFE_STRING, 0, 0),
        (None, SAFE_STRING, NO_NULL, -13),
        (None, SAFE_STRING, DISOWN, 0),
    ],
)
def test_conversion_results(peer, made, target, flags, code):
    if isinstance(made, tuple):
        made = peer.make(made[0], 0x2220, NO_SHADOW | made[1])
    result = peer.convert(made, target, flags)
    assert result[0] == code
    if code < 0 or made is None:
        assert result[1] is None
    else:
        assert result[1] == 0x2220


@pytest.mark.parametrize("flags", [0, DISOWN])
def test_conversion_reports_and_moves_ownership(peer, flags):
    owning = _Client3.new_SafeString()
    assert peer.convert(owning, SAFE_STRING, flags) == (0, int(owning), 1)
    assert owning.own() is (flags == 0)
    # A refused conversion leaves ownership alone, whatever the flags.
    again = _Client3.new_SafeString()
    assert peer.convert(again, TYPE_PARAMETER, DISOWN)[0] == -1
    assert again.own() is True
    borrowed = peer.make(SAFE_STRING, 0x10, NO_SHADOW)
    assert peer.convert(borrowed, SAFE_STRING, flags) == (0, 0x10, 0)


def test_this_attributes_and_proxy_chains_are_followed(peer):
    class Holder:
        pass

    inner, outer = Holder(), Holder()
    proxy = _Client3.new_SafeString()
    inner.this = proxy
    outer.this = inner
    assert peer.convert(outer, SAFE_STRING, 0)[:2] == (0, int(proxy))
    assert _Client3.SafeString_IsEmpty(outer) is True
    # The second proxy of a chain answers for a second type.
    second = peer.make(TYPE_PARAMETER, 0x3330, NO_SHADOW)
    proxy.append(second)
    assert peer.convert(outer, TYPE_PARAMETER, 0)[:2] == (0, 0x3330)
    assert peer.convert(outer, VECTOR_DOUBLE, 0)[0] == -1

    class Broken:
        @property
        def this(self):
            raise KeyError("no proxy")

    assert peer.convert(Broken(), SAFE_STRING, 0)[0] == -1
    with pytest.raises(TypeError, match="^in method 'SafeString_IsEmpty'"):
        _Client3.SafeString_IsEmpty(Broken())


def test_implicit_conversion_builds_the_target_class(peer):
    made = peer.convert("abc", SAFE_STRING, IMPLICIT)
    assert made[0] == 512 and made[1]
    assert peer.convert(5, SAFE_STRING, IMPLICIT) == (-1, None, 0)  # the class refused it: no error kept
    assert peer.convert(None, SAFE_STRING, IMPLICIT) == (0, None, 0)
    assert peer.convert(5, "_p_int", IMPLICIT)[0] == -1  # no class registered


def test_implicit_conversion_asked_for_its_code_only(peer):
    assert peer.convert("abc", SAFE_STRING, IMPLICIT, False)[0] == 0


# ---- Registration -------------------------------------------------------------------------------


@pytest.mark.parametrize("wrap", [lambda c: c, lambda c: (c,)])
def test_swigregister_attaches_the_class(peer, safe_string_class, wrap):
    class Registered:
        def __init__(self):
            raise AssertionError("results are made without running __init__")

    assert _Client3.SafeString_swigregister(wrap(Registered)) is None
    result = peer.make(SAFE_STRING, 0x4440, 0)
    assert type(result) is Registered
    assert type(result.this).__name__ == "SwigPyObject"
    assert int(result.this) == 0x4440 and result.this.own() is False
    # The bare proxy is still available on request, and from the new_ function.
    assert type(peer.make(SAFE_STRING, 0x4440, NO_SHADOW)).__name__ == "SwigPyObject"
    assert type(_Client3.new_SafeString()).__name__ == "SwigPyObject"


def test_swigregister_with_an_object_that_is_not_a_class(peer, safe_string_class):
    class Made:
        pass

    class Factory:
        def __new__(cls):
            return object.__new__(cls)

    factory = Factory()
    factory.__new__ = lambda owner: Made()
    _Client3.SafeString_swigregister(factory)
    result = peer.make(SAFE_STRING, 0x5550, 0)
    assert type(result) is Made
    assert int(result.this) == 0x5550


@pytest.mark.parametrize(
    "args, message",
    [
        ((), "swigregister expected 1 arguments, got 0"),
        ((object, object), "swigregister expected 1 arguments, got 2"),
    ],
)
def test_swigregister_argument_count(peer, args, message):
    before = type(peer.make(SAFE_STRING, 0x10, 0))
    with pytest.raises(TypeError) as raised:
        _Client3.SafeString_swigregister(args)
    assert str(raised.value) == message
    assert type(peer.make(SAFE_STRING, 0x10, 0)) is before


def test_swiginit_stores_or_appends(peer):
    cls = companion.classes["SafeString"]
    instance = cls.__new__(cls)
    first = _Client3.new_SafeString()
    assert _Client3.SafeString_swiginit(instance, first) is None
    assert instance.__dict__ == {"this": first}
    second = peer.make(TYPE_PARAMETER, 0x6660, NO_SHADOW)
    assert _Client3.SafeString_swiginit(instance, second) is None
    assert instance.this is first and first.next() is second
    # Through a "this" chain to the proxy.
    outer = cls.__new__(cls)
    outer.__dict__["this"] = instance
    third = _Client3.new_SafeString()
    assert _Client3.SafeString_swiginit(outer, third) is None
    assert first.next() is third


def test_swiginit_refused_append_answers_none_with_the_error_pending():
    cls = companion.classes["SafeString"]
    instance = cls()
    kept = instance.this
    with pytest.raises(SystemError) as raised:
        _Client3.SafeString_swiginit(instance, 5)
    cause = raised.value.__cause__
    assert type(cause) is TypeError and str(cause) == "Attempt to append a non SwigPyObject"
    assert instance.this is kept and kept.next() is None


@pytest.mark.parametrize("count", [0, 1, 3])
def test_swiginit_argument_count(count):
    instance = companion.classes["SafeString"]()
    with pytest.raises(TypeError) as raised:
        _Client3.SafeString_swiginit(*[instance, _Client3.new_SafeString(), 1][:count])
    assert str(raised.value) == "swiginit expected 2 arguments, got %d" % count
    assert instance.this.next() is None


# ---- Lookups by name ----------------------------------------------------------------------------


@pytest.mark.parametrize(
    "text, found",
    [
        (VECTOR_DOUBLE, VECTOR_DOUBLE),
        ("std::vector< double > *", VECTOR_DOUBLE),
        ("std::vector<double> *", VECTOR_DOUBLE),
        ("std::vector<double,std::allocator<double> >*", VECTOR_DOUBLE),
        ("  std::vector < double > * ", VECTOR_DOUBLE),
        ("INT32*", "_p_int"),
        ("char *", "_p_char"),
        ("ZarvoSDKClientCPP::SafeString *", SAFE_STRING),
        ("std::vector< ZarvoSDKClientCPP::SafeString >::value_type *", SAFE_STRING),
        ("std::vector< double >", None),
        ("std::vector< double > **", None),
        ("std::string *", None),
        ("", None),
        ("_p_nothing", None),
    ],
)
def test_type_query(peer, text, found):
    assert peer.query(text) == found
    assert peer.query(text) == found
    if found:
        assert text in peer.cache()
    else:
        assert text not in peer.cache()


def test_type_query_cache_is_keyed_by_exact_text(peer):
    capsule_new = ctypes.pythonapi.PyCapsule_New
    capsule_new.restype = ctypes.py_object
    capsule_new.argtypes = [ctypes.c_void_p, ctypes.c_char_p, ctypes.c_void_p]
    cache = peer.cache()
    # A cached answer is taken as it stands, without looking at the ring again.
    cache["std::vector< int > *"] = capsule_new(peer.descriptor("_p_char")[1], None, None)
    try:
        assert peer.query("std::vector< int > *") == "_p_char"
        assert peer.query("std::vector<int> *") == "_p_std__vectorT_int_std__allocatorT_int_t_t"
    finally:
        del cache["std::vector< int > *"]
    assert peer.query("std::vector< int > *") == "_p_std__vectorT_int_std__allocatorT_int_t_t"


# ---- Bad input from other modules and scripts, in a fresh interpreter ------------------------------

CRASH_CASES = {
    # A proxy may carry no descriptor; it is then accepted only where any type is.
    "null descriptor": """
proxy = peer.make(None, 16, 2)
assert peer.convert(proxy, None, 0) == (0, 16, 0)
assert peer.convert(proxy, "_p_ZarvoSDKClientCPP__SafeString", 0)[0] == -1
try:
    _Client3.SafeString_IsEmpty(proxy)
except TypeError as error:
    print(error)
""",
    # A registered class that cannot make instances: results cannot be made, and say so.
    "class without creation slot": """
_Client3.SafeString_swigregister(type(iter([])))
try:
    peer.make("_p_ZarvoSDKClientCPP__SafeString", 16, 0)
except TypeError:
    print("refused")
""",
    # A chain of "this" attributes that loops back holds no proxy.
    "this loops back": """
class Loop:
    pass
loop = Loop()
loop.this = loop
try:
    _Client3.SafeString_IsEmpty(loop)
except TypeError as error:
    print(error)
""",
    # A "this" made afresh on every access is gone once looked at: it holds no proxy.
    "this made afresh": """
class Fresh:
    @property
    def this(self):
        return peer.make("_p_ZarvoSDKClientCPP__SafeString", 16, 0)
try:
    _Client3.SafeString_IsEmpty(Fresh())
except TypeError as error:
    print(error)
""",
}
CRASH_OUTPUT = {
    "null descriptor": "in method 'SafeString_IsEmpty', argument 1 of type 'ZarvoSDKClientCPP::SafeString const *'\n",
    "class without creation slot": "refused\n",
    "this loops back": "in method 'SafeString_IsEmpty', argument 1 of type 'ZarvoSDKClientCPP::SafeString const *'\n",
    "this made afresh": "in method 'SafeString_IsEmpty', argument 1 of type 'ZarvoSDKClientCPP::SafeString const *'\n",
}


@pytest.mark.parametrize(
    "case",
    [
        "null descriptor",
        "class without creation slot",
        "this loops back",
        "this made afresh",
    ],
)
def test_bad_input_from_outside_does_not_crash(peer, case):
    rc, out, err = run_python("import _Client3\n" + build.import_lines(peer.__file__) + CRASH_CASES[case])
    assert (rc, out, err) == (0, CRASH_OUTPUT[case], "")


@pytest.mark.parametrize("instance", [object(), int, 5])
def test_swiginit_on_an_instance_without_a_dictionary_answers_none_with_the_error_pending(instance):
    with pytest.raises(SystemError) as raised:
        _Client3.SafeString_swiginit(instance, _Client3.new_SafeString())
    assert raised.value.__cause__ is not None
