"""The container protocol of the six vector types, table-driven over the instances."""
import ctypes
import gc
import resource
import weakref

import pytest

import _Client3 as m
import companion
from conftest import overload_text, raises


def function_name(prefix, member):
    return f"new_{prefix}" if member == "new" else f"{prefix}_{member}"


class Instance:
    def __init__(self, prefix, element, samples, wrong):  # five distinct elements; one refused element
        self.prefix, self.samples, self.wrong = prefix, samples, wrong
        self.container, self.source = f"std::vector< {element} >", f"std::vector< {element},std::allocator< {element} > >"
        self.packed, self.text = element == "bool", prefix == "vectorss"
        self.element = self.container + "::value_type"  # as argument messages name an element
        self.value_type = self.element + ("" if self.packed else " const &")  # as prototypes take it
        self.new = getattr(m, "new_" + prefix)
        self.new_refused = self.refused("new")

    def fn(self, name):
        return getattr(m, function_name(self.prefix, name))

    def refused(self, member):
        """The message of overloaded `member` when no form accepts its arguments."""
        c, d, s = self.container, self.container + "::difference_type", self.container + "::size_type"
        it, vt, src = self.container + "::iterator", self.value_type, self.source + " const &"
        prototypes = {
            "__getitem__": [f"{c}::__getitem__(PySliceObject *)",
                            f"{c}::__getitem__({d})" + ("" if self.packed else " const")],
            "__setitem__": [f"{c}::__setitem__(PySliceObject *,{src})", f"{c}::__setitem__(PySliceObject *)",
                            f"{c}::__setitem__({d},{vt})"],
            "__delitem__": [f"{c}::__delitem__({d})", f"{c}::__delitem__(PySliceObject *)"],
            "__setslice__": [f"{c}::__setslice__({d},{d})", f"{c}::__setslice__({d},{d},{src})"],
            "erase": [f"{c}::erase({it})", f"{c}::erase({it},{it})"],
            "new": [f"{c}::vector()", f"{c}::vector({c} const &)", f"{c}::vector({s})", f"{c}::vector({s},{vt})"],
            "resize": [f"{c}::resize({s})", f"{c}::resize({s},{vt})"],
            "insert": [f"{c}::insert({it},{vt})", f"{c}::insert({it},{s},{vt})"],
        }[member]
        return overload_text(function_name(self.prefix, member), *prototypes)

    def make(self, items=None):
        return self.new(list(self.samples if items is None else items))

    def value(self, obj):
        return m.SafeString_Value(obj) if self.text else obj

    def read(self, v):
        return [self.value(self.fn("__getitem__")(v, i)) for i in range(self.fn("size")(v))]


INSTANCES = [
    Instance("vectorb", "bool", [True, False, False, True, True], 1),
    Instance("vectord", "double", [0.5, 1.5, -2.25, 3.0, 1e300], "1.0"),
    Instance("vectorf", "float", [0.5, 1.5, -2.25, 3.0, 1024.0], 1e39),
    Instance("vectori", "int", [1, -2, 3, 2**31 - 1, -(2**31)], 2**31),
    Instance("vectorull", "unsigned long long", [0, 2**31 - 1, 2**31, 2**64 - 1, 5], -1),
    Instance("vectorss", "ZarvoSDKClientCPP::SafeString", ["a", "bc", "", "d\u00e9", "e"], 3),
]
by_instance = pytest.mark.parametrize("inst", INSTANCES, ids=lambda inst: inst.prefix)

MEMBERS = ("iterator __nonzero__ __bool__ __len__ __getslice__ __setslice__ __delslice__ __delitem__ __getitem__ "
           "__setitem__ pop append empty size swap begin end rbegin rend clear get_allocator pop_back erase new "
           "push_back front back assign resize insert reserve capacity swigregister swiginit").split()
SELF_ONLY = set("iterator __nonzero__ __bool__ __len__ pop empty size begin end rbegin rend clear get_allocator "
                "pop_back front back capacity swigregister".split())
OVERLOADED = set("__setslice__ __delitem__ __getitem__ __setitem__ erase resize insert new".split())


@by_instance
def test_calling_conventions(inst):
    """One-object functions refuse an empty call in the interpreter's words, tuple functions in ours."""
    for member in MEMBERS:
        args = [1, 2, 3] if member == "new" else []
        text = str(pytest.raises(TypeError, getattr(m, function_name(inst.prefix, member)), *args).value)
        if member in SELF_ONLY:
            assert "takes exactly one argument (0 given)" in text, member
        elif member in OVERLOADED:
            assert "Wrong number or type of arguments for overloaded function" in text, member
        else:
            assert " expected 2 arguments, got 0" in text or " expected 3 arguments, got 0" in text, member


@by_instance
def test_sizes_and_pop(inst):
    v = inst.new()
    assert [inst.fn(f)(v) for f in ("__len__", "size", "__bool__", "__nonzero__", "empty")] == [0, 0, False, False, True]
    raises(IndexError, "pop from empty container", inst.fn("pop"), v)
    w = inst.make()
    assert [inst.fn(f)(w) for f in ("__len__", "__bool__", "empty")] == [5, True, False]
    assert inst.value(inst.fn("pop")(w)) == inst.samples[-1] and inst.fn("pop_back")(w) is None
    assert inst.read(w) == inst.samples[:3]
    assert (inst.value(inst.fn("front")(w)), inst.value(inst.fn("back")(w))) == (inst.samples[0], inst.samples[2])
    # front and back of an empty vector raise; pop_back of it does nothing.
    for name in ("front", "back"):
        pytest.raises(IndexError, inst.fn(name), v)
    assert inst.fn("pop_back")(v) is None and inst.fn("size")(v) == 0


@by_instance
@pytest.mark.parametrize("index, position", [(0, 0), (-1, 4), (-5, 0), (5, None), (-6, None)])
def test_index_access(inst, index, position):
    v, expected = inst.make(), list(inst.samples)
    get, set_, delete = inst.fn("__getitem__"), inst.fn("__setitem__"), inst.fn("__delitem__")
    if position is None:
        for call in (lambda: get(v, index), lambda: set_(v, index, inst.samples[0]), lambda: delete(v, index)):
            raises(IndexError, "index out of range", call)
    else:
        got = get(v, index)
        assert type(got).__name__ == "SafeString" if inst.text else type(got) is type(inst.samples[0])
        assert inst.value(got) == inst.samples[position]
        expected[position] = inst.samples[(position + 1) % 5]
        assert set_(v, index, expected[position]) is None and inst.read(v) == expected and delete(v, index) is None
        del expected[position]
    assert inst.read(v) == expected


@by_instance
def test_no_element_in_an_empty_vector(inst):
    v = inst.make()
    inst.fn("clear")(v)  # its storage stays: a read past the end would answer rather than fault
    raises(IndexError, "index out of range", inst.fn("__getitem__"), v, 0)
    raises(IndexError, "index out of range", inst.fn("__setitem__"), v, 0, inst.samples[0])
    raises(IndexError, "index out of range", inst.fn("__delitem__"), v, 0)
    assert inst.fn("size")(v) == 0


# Every function that takes an element: its arguments after self, given an iterator at the vector's
# begin and the element, and the element's argument number; None where the overload test refuses it.
# (__setitem__'s index is out of range: the element is reported before the index is looked at.)
@by_instance
@pytest.mark.parametrize("member, arguments, position", [
    ("append", lambda at, x: (x,), 2),
    ("push_back", lambda at, x: (x,), 2),
    ("assign", lambda at, x: (2, x), 3),
    ("__setitem__", lambda at, x: (99, x), 3),
    ("resize", lambda at, x: (7, x), None),
    ("insert", lambda at, x: (at, x), None),
    ("insert", lambda at, x: (at, 2, x), None),
    ("new", lambda at, x: (2, x), None),
], ids=["append", "push_back", "assign", "__setitem__", "resize", "insert", "insert n", "new"])
def test_refused_element(inst, member, arguments, position):
    v = inst.make()
    args = arguments(inst.fn("begin")(v), inst.wrong)
    name = function_name(inst.prefix, member)
    if position is None:
        expected = TypeError, inst.refused(member)
    elif inst.text:
        expected = TypeError, "Expected string type"
    else:
        expected = (TypeError, OverflowError), f"in method '{name}', argument {position} of type '{inst.element}'"
    raises(*expected, inst.fn(member), *(args if member == "new" else (v, *args)))
    assert inst.read(v) == inst.samples


@by_instance
def test_swap_assign_resize_reserve_clear(inst):
    v, w = inst.make(), inst.make(inst.samples[:2])
    assert inst.fn("swap")(v, w) is None and (inst.read(v), inst.read(w)) == (inst.samples[:2], inst.samples)
    raises(ValueError, f"invalid null reference in method '{inst.prefix}_swap', argument 2 of type '{inst.container} &'",
           inst.fn("swap"), v, None)
    assert [inst.fn(f)(v, *args) for f, args in (("assign", (3, inst.samples[1])), ("resize", (4, inst.samples[0])),
                                                  ("resize", (6,)))] == [None] * 3
    default = {"vectorb": False, "vectorss": ""}.get(inst.prefix, 0)
    assert inst.read(v) == [inst.samples[1]] * 3 + [inst.samples[0], default, default]
    assert inst.fn("reserve")(v, 100) is None and inst.fn("capacity")(v) >= 100
    assert inst.fn("clear")(v) is None and inst.fn("size")(v) == 0


@pytest.fixture(scope="module")
def bounded_growth():
    """Vectors made by scripts are never freed, so a count taken by mistake would keep its gigabytes for the
    rest of the run: from here on, the process may grow by 3 GB at most."""
    soft, hard = resource.getrlimit(resource.RLIMIT_AS)
    with open("/proc/self/statm") as statm:
        size = int(statm.read().split()[0]) * resource.getpagesize()
    limit = size + 3 * 2**30
    resource.setrlimit(resource.RLIMIT_AS, (limit if hard == resource.RLIM_INFINITY else min(limit, hard), hard))
    yield
    resource.setrlimit(resource.RLIMIT_AS, (soft, hard))


def test_no_count_of_bits_is_too_large():
    v = m.new_vectorb()
    assert m.vectorb_reserve(v, 2**32 - 1) is None and m.vectorb_capacity(v) >= 2**32 - 1


# The bytes of one element; the packed bits have no count whose bytes fail to fit.
ELEMENT_BYTES = {"vectord": 8, "vectorf": 4, "vectori": 4, "vectorull": 8, "vectorss": 3 * ctypes.sizeof(ctypes.c_void_p)}


# Every function that takes a count: its arguments after self, given an iterator at the vector's begin,
# the count and an element.
@pytest.mark.parametrize("inst", [i for i in INSTANCES if not i.packed], ids=lambda inst: inst.prefix)
@pytest.mark.parametrize("member, arguments", [
    ("new", lambda at, n, x: (n,)),
    ("new", lambda at, n, x: (n, x)),
    ("resize", lambda at, n, x: (n,)),
    ("resize", lambda at, n, x: (n, x)),
    ("reserve", lambda at, n, x: (n,)),
    ("assign", lambda at, n, x: (n, x)),
    ("insert", lambda at, n, x: (at, n, x)),
    ("insert", lambda at, n, x: (at, n - 5, x)),  # fits alone, but not with the five already there
], ids=["new n", "new n x", "resize n", "resize n x", "reserve", "assign", "insert", "insert beside"])
def test_counts_whose_bytes_do_not_fit_a_32_bit_process(bounded_growth, inst, member, arguments):
    """The smallest count too large in bytes is refused before anything is allocated."""
    v = inst.make()
    capacity = inst.fn("capacity")(v)
    args = arguments(inst.fn("begin")(v), 0x7FFFFFFF // ELEMENT_BYTES[inst.prefix] + 1, inst.samples[1])
    pytest.raises(MemoryError, inst.fn(member), *(args if member == "new" else (v, *args)))
    assert inst.read(v) == inst.samples and inst.fn("capacity")(v) == capacity


@by_instance
@pytest.mark.parametrize("member, args, position, error, arg_type", [
    ("reserve", (-1,), 2, OverflowError, "size_type"),
    ("__getslice__", (2**31, 0), 2, OverflowError, "difference_type"),
    ("__delslice__", (0, 1.5), 3, TypeError, "difference_type"),
])
def test_index_and_size_arguments(inst, member, args, position, error, arg_type):
    v = inst.make()
    raises(error, f"in method '{inst.prefix}_{member}', argument {position} of type '{inst.container}::{arg_type}'",
           inst.fn(member), v, *args)
    assert inst.read(v) == inst.samples


@by_instance
def test_overload_messages(inst):
    v = inst.make()
    cases = {"__getitem__": (v, 1.0), "__setitem__": (v, 1.0, 1), "__delitem__": (v, None), "__setslice__": (v, 0),
             "erase": (v, 0), "resize": (v, -1), "insert": (v, None, 1), "new": (1.5,)}
    for member, args in cases.items():
        raises(TypeError, inst.refused(member), inst.fn(member), *args)
    assert inst.read(v) == inst.samples
    # Self of the wrong type: another instance's vector, a plain object.
    for member, self_, text in (("pop", INSTANCES[(INSTANCES.index(inst) + 1) % 6].make(), "*"), ("empty", 3, "const *")):
        raises(TypeError, f"in method '{inst.prefix}_{member}', argument 1 of type '{inst.container} {text}'",
               inst.fn(member), self_)


@by_instance
def test_constructors_and_allocator(inst):
    assert inst.read(inst.new()) == [] and inst.read(inst.new(2, inst.samples[3])) == [inst.samples[3]] * 2
    assert len(set(map(repr, inst.read(inst.new(3))))) == 1
    original = inst.make()
    copy = inst.new(original)
    assert inst.fn("clear")(original) is None and inst.read(copy) == inst.samples  # the copy keeps its elements
    # A proxy shows the last of its type's readable names: the short form, or the allocator form for these.
    shown = inst.source if inst.prefix in ("vectorf", "vectorull", "vectorss") else inst.container
    assert copy.own() is True and repr(copy) == f"<Swig Object of type '{shown} *' at {id(copy):#x}>"
    allocator = inst.fn("get_allocator")(copy)
    assert allocator.own() is True and f"std::allocator< {inst.container[13:-2]} > *" in repr(allocator)


@by_instance
def test_erase_and_insert_with_iterators(inst):
    v, w, s = inst.make(), inst.make(), inst.samples
    other = INSTANCES[(INSTANCES.index(inst) + 1) % 6]
    for wrong in (inst.fn("rbegin")(v), other.fn("begin")(other.make())):  # another kind, another vector type
        raises(TypeError, f"in method '{inst.prefix}_erase', argument 2 of type '{inst.container}::iterator'",
               inst.fn("erase"), v, wrong)
    for outside in (inst.fn("begin")(w), inst.fn("end")(v)):  # refused rather than followed
        pytest.raises(IndexError, inst.fn("erase"), v, outside)
    assert inst.read(v) == inst.read(w) == s
    at = inst.fn("erase")(v, m.SwigPyIterator___add__(inst.fn("begin")(v), 1))
    assert inst.read(v) == s[:1] + s[2:] and inst.value(m.SwigPyIterator_value(at)) == s[2]
    at = inst.fn("insert")(v, at, s[1])
    assert inst.read(v) == s and inst.value(m.SwigPyIterator_value(at)) == s[1]
    assert inst.fn("insert")(v, inst.fn("end")(v), 2, s[0]) is None
    first = inst.fn("begin")(v)
    at = inst.fn("erase")(v, first, m.SwigPyIterator___add__(first, 3))
    assert inst.read(v) == s[3:] + [s[0]] * 2 and inst.value(m.SwigPyIterator_value(at)) == s[3]
    inst.fn("erase")(v, inst.fn("iterator")(v))  # a closed iterator is a forward position too
    assert inst.read(v) == s[4:] + [s[0]] * 2


@by_instance
@pytest.mark.parametrize("size, at", [(5, 0), (5, 5), (0, 0)], ids=["start", "end", "empty"])
def test_erasing_an_empty_range(inst, size, at):
    v = inst.make(inst.samples[:size])
    position = m.SwigPyIterator___add__(inst.fn("begin")(v), at)
    left = inst.fn("erase")(v, position, m.SwigPyIterator_copy(position))
    assert inst.read(v) == inst.samples[:size]
    assert m.SwigPyIterator_distance(inst.fn("begin")(v), left) == at


@pytest.mark.parametrize("member", ["__getitem__", "front", "back"])
def test_string_elements_keep_their_vector_alive(member):
    vector = companion.classes["vectorss"](["kept"])
    element = getattr(m, "vectorss_" + member)(*((vector, 0) if member == "__getitem__" else (vector,)))
    assert element.__swig_container is vector and element.this.own() is False
    alive = weakref.ref(vector)
    del vector
    gc.collect()
    assert alive() is not None and m.SafeString_Value(element) == "kept"
    del element
    gc.collect()
    assert alive() is None
    popped = m.vectorss_pop(m.new_vectorss(["copy"]))
    assert popped.this.own() is True and not hasattr(popped, "__swig_container")
