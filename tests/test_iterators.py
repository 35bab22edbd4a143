"""Iterator objects over the six vector types."""
import sys

import pytest

import _Client3 as m
import companion
from conftest import run_python
from test_vectors import INSTANCES, by_instance



def walk(inst, iterator, steps):
    return [inst.value(m.SwigPyIterator_next(iterator)) for _ in range(steps)]


@by_instance
def test_closed_iterator_walks_once_and_stops(inst):
    v = inst.make()
    iterator = inst.fn("iterator")(v)
    assert walk(inst, iterator, 5) == inst.samples
    for _ in range(3):
        with pytest.raises(StopIteration) as info:
            m.SwigPyIterator___next__(iterator)
        assert info.value.value is None
        with pytest.raises(StopIteration):
            m.SwigPyIterator_value(iterator)
    assert inst.value(m.SwigPyIterator_previous(iterator)) == inst.samples[-1]
    assert m.SwigPyIterator_distance(inst.fn("begin")(v), iterator) == 4


@by_instance
def test_closed_bounds_keep_the_partial_move(inst):
    v = inst.make(inst.samples[:2])
    iterator = inst.fn("iterator")(v)
    with pytest.raises(StopIteration):
        m.SwigPyIterator_incr(iterator, 5)
    assert m.SwigPyIterator_equal(iterator, inst.fn("end")(v)) is True
    with pytest.raises(StopIteration):
        m.SwigPyIterator_decr(iterator, 3)
    assert m.SwigPyIterator_equal(iterator, inst.fn("begin")(v)) is True
    with pytest.raises(StopIteration):
        m.SwigPyIterator_advance(iterator, -1)


@by_instance
def test_open_iterators_walk_both_ways(inst):
    v = inst.make()
    forward, end = inst.fn("begin")(v), inst.fn("end")(v)
    seen = []
    while not m.SwigPyIterator___eq__(forward, end):
        seen.append(inst.value(m.SwigPyIterator_next(forward)))
    assert seen == inst.samples
    backward, rend = inst.fn("rbegin")(v), inst.fn("rend")(v)
    seen = []
    while m.SwigPyIterator___ne__(backward, rend):
        seen.append(inst.value(m.SwigPyIterator___next__(backward)))
    assert seen == inst.samples[::-1]
    assert inst.value(m.SwigPyIterator_previous(backward)) == inst.samples[0]
    assert m.SwigPyIterator_distance(inst.fn("rbegin")(v), rend) == 5


@by_instance
def test_arithmetic(inst):
    v = inst.make()
    begin, end = inst.fn("begin")(v), inst.fn("end")(v)
    assert m.SwigPyIterator___sub__(end, begin) == 5
    assert m.SwigPyIterator___sub__(begin, end) == -5
    assert m.SwigPyIterator___eq__(inst.fn("iterator")(v), begin) is True
    third = m.SwigPyIterator___add__(begin, 2)
    assert inst.value(m.SwigPyIterator_value(begin)) == inst.samples[0]  # unchanged
    assert inst.value(m.SwigPyIterator_value(third)) == inst.samples[2]
    back = m.SwigPyIterator___sub__(third, 1)
    assert inst.value(m.SwigPyIterator_value(back)) == inst.samples[1]
    moved = m.SwigPyIterator_advance(back, 2)
    assert inst.value(m.SwigPyIterator_value(back)) == inst.samples[3]
    assert moved.this.own() is False  # a second, non-owning proxy on the same iterator
    assert m.SwigPyIterator_equal(moved, back)
    copy = m.SwigPyIterator_copy(back)
    m.SwigPyIterator_incr(back)
    m.SwigPyIterator_decr(copy, 2)
    assert (inst.value(m.SwigPyIterator_value(back)), inst.value(m.SwigPyIterator_value(copy))) == (
        inst.samples[4], inst.samples[1])


def test_in_place_operators_move_the_object_and_take_ownership():
    v = m.new_vectori([10, 20, 30])
    iterator = m.vectori_begin(v)
    result = m.SwigPyIterator___iadd__(iterator, 2)
    assert m.SwigPyIterator_value(iterator) == 30
    assert result.this.own() is True and iterator.this.own() is False
    assert int(result.this) == int(iterator.this)
    again = m.SwigPyIterator___isub__(result, 1)
    assert m.SwigPyIterator_value(again) == 20
    assert again.this.own() is True and result.this.own() is False


def test_in_place_operator_that_fails_keeps_ownership():
    v = m.new_vectori([10])
    iterator = m.vectori_iterator(v)
    with pytest.raises(StopIteration):
        m.SwigPyIterator___iadd__(iterator, 3)
    assert iterator.this.own() is True
    with pytest.raises(OverflowError):
        m.SwigPyIterator___iadd__(iterator, 2**31)
    assert iterator.this.own() is True


@pytest.mark.parametrize("left, right", [("begin", "rbegin"), ("rend", "end"), ("iterator", "rbegin")])
def test_different_kinds_do_not_relate(left, right):
    v = m.new_vectord([1.0, 2.0])
    a, b = getattr(m, "vectord_" + left)(v), getattr(m, "vectord_" + right)(v)
    for operator in (m.SwigPyIterator___eq__, m.SwigPyIterator___ne__, m.SwigPyIterator___sub__):
        with pytest.raises(ValueError) as info:
            operator(a, b)
        assert str(info.value) == "bad iterator type"
    # distance and equal raise the native exception object itself.
    for relation in (m.SwigPyIterator_distance, m.SwigPyIterator_equal):
        with pytest.raises(RuntimeError) as info:
            relation(a, b)
        assert "std::invalid_argument" in repr(info.value.args[0])


def test_iterators_of_two_instances_do_not_relate():
    with pytest.raises(ValueError, match="^bad iterator type$"):
        m.SwigPyIterator___eq__(m.vectord_begin(m.new_vectord()), m.vectorf_begin(m.new_vectorf()))


@pytest.mark.parametrize("operator", ["__eq__", "__ne__", "__add__", "__sub__"])
@pytest.mark.parametrize("other", [3.5, "x", object(), m.new_vectord()])
def test_operators_answer_not_implemented(operator, other):
    iterator = m.vectord_begin(m.new_vectord([1.0]))
    assert getattr(m, "SwigPyIterator_" + operator)(iterator, other) is NotImplemented
    assert getattr(m, "SwigPyIterator_" + operator)(other, iterator) is NotImplemented
    assert sys.exc_info() == (None, None, None)


@pytest.mark.parametrize("name", ["distance", "equal", "__eq__", "__ne__", "__sub__"])
def test_none_is_a_null_reference(name):
    iterator = m.vectord_begin(m.new_vectord([1.0]))
    with pytest.raises(ValueError) as info:
        getattr(m, "SwigPyIterator_" + name)(iterator, None)
    assert str(info.value) == (f"invalid null reference in method 'SwigPyIterator_{name}', argument 2 of type "
                               "'swig::SwigPyIterator const &'")


@pytest.mark.parametrize("name", ["incr", "decr"])
def test_incr_and_decr_overloads(name):
    iterator = m.vectord_begin(m.new_vectord([1.0]))
    expected = (f"Wrong number or type of arguments for overloaded function 'SwigPyIterator_{name}'.\n"
                f"  Possible C/C++ prototypes are:\n    swig::SwigPyIterator::{name}(size_t)\n"
                f"    swig::SwigPyIterator::{name}()\n")
    for args in [(iterator, 1, 2), (iterator, -1), (iterator, "1"), (3,)]:
        with pytest.raises(TypeError) as info:
            getattr(m, "SwigPyIterator_" + name)(*args)
        text = str(info.value)
        assert text.endswith(expected)
        assert text == expected or "expected at most 2 arguments, got 3\nAdditional information:\n" in text


@pytest.mark.parametrize(
    "name, args, text",
    [
        ("SwigPyIterator_value", (1,), "in method 'SwigPyIterator_value', argument 1 of type 'swig::SwigPyIterator const *'"),
        ("SwigPyIterator_next", (1,), "in method 'SwigPyIterator_next', argument 1 of type 'swig::SwigPyIterator *'"),
        ("SwigPyIterator_advance", (None, 1), None),
        ("delete_SwigPyIterator", (1.5,), "in method 'delete_SwigPyIterator', argument 1 of type 'swig::SwigPyIterator *'"),
        ("SwigPyIterator_copy", (m.new_vectord(),), "in method 'SwigPyIterator_copy', argument 1 of type 'swig::SwigPyIterator const *'"),
    ],
)
def test_argument_messages(name, args, text):
    with pytest.raises((TypeError, ValueError)) as info:
        getattr(m, name)(*args)
    if text is None:
        assert type(info.value) is ValueError and "invalid null reference" in str(info.value)
    else:
        assert type(info.value) is TypeError and str(info.value) == text


def test_delete_releases_the_closed_iterators_vector():
    vector = companion.classes["vectord"]()
    before = sys.getrefcount(vector)
    iterator = m.vectord_iterator(vector)
    assert sys.getrefcount(vector) == before + 1
    copy = m.SwigPyIterator_copy(iterator)
    assert sys.getrefcount(vector) == before + 2
    assert m.delete_SwigPyIterator(iterator) is None
    del copy
    assert sys.getrefcount(vector) == before
    m.delete_SwigPyIterator(None)
    open_iterator = m.vectord_begin(vector)
    assert sys.getrefcount(vector) == before
    del open_iterator


def test_string_values_are_independent_copies():
    v = m.new_vectorss(["one", "two"])
    first = m.SwigPyIterator_next(m.vectorss_iterator(v))
    assert first.this.own() is True
    m.vectorss___setitem__(v, 0, "changed")
    assert m.SafeString_Value(first) == "one"


def test_bool_iterators_walk_bits():
    v = m.new_vectorb([True, False, True])
    assert [m.SwigPyIterator_next(m.vectorb_iterator(v))] == [True]
    rb = m.vectorb_rbegin(v)
    assert [m.SwigPyIterator_next(rb) for _ in range(3)] == [True, False, True]
    assert m.SwigPyIterator___sub__(m.vectorb_end(v), m.vectorb_begin(v)) == 3


def test_open_iterator_outside_the_vector_is_not_read():
    code = """
import _Client3 as m
v = m.new_vectord([1.0, 2.0])
it = m.vectord_end(v)
for step in range(3):
    try:
        m.SwigPyIterator_value(it)
        raise SystemExit("read past the end")
    except StopIteration:
        pass
    m.SwigPyIterator_incr(it, 1000)
before = m.vectord_rend(v)
try:
    m.SwigPyIterator_next(before)
    raise SystemExit("read before the start")
except StopIteration:
    pass
print("ok")
"""
    status, out, err = run_python(code)
    assert status == 0 and "ok" in out.splitlines(), err
