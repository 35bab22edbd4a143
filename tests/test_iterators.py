"""Iterator objects over the six vector types."""
import sys

import pytest

import _Client3 as m
import companion
from conftest import overload_text, raises
from test_vectors import by_instance


@by_instance
def test_closed_iterator_stays_in_its_range(inst):
    v = inst.make()
    iterator = inst.fn("iterator")(v)
    assert [inst.value(m.SwigPyIterator___next__(iterator)) for _ in range(5)] == inst.samples
    for call in (m.SwigPyIterator___next__, m.SwigPyIterator_next, m.SwigPyIterator_value, m.SwigPyIterator___next__):
        assert pytest.raises(StopIteration, call, iterator).value.value is None
    assert [inst.value(m.SwigPyIterator_previous(iterator)) for _ in range(5)] == inst.samples[::-1]
    # Steps past either end stop; the steps made before the end stay made.
    for call, args, at in ((m.SwigPyIterator_decr, (), None), (m.SwigPyIterator_incr, (9,), "end"),
                           (m.SwigPyIterator_advance, (-7,), "begin")):
        pytest.raises(StopIteration, call, iterator, *args)
        assert at is None or m.SwigPyIterator_equal(iterator, inst.fn(at)(v)) is True


@by_instance
def test_open_iterators_walk_both_ways_and_move(inst):
    v = inst.make()
    for first, last, expected in (("begin", "end", inst.samples), ("rbegin", "rend", inst.samples[::-1])):
        iterator, end, seen = inst.fn(first)(v), inst.fn(last)(v), []
        while m.SwigPyIterator___ne__(iterator, end):
            seen.append(inst.value(m.SwigPyIterator_next(iterator)))
        assert seen == expected and m.SwigPyIterator___eq__(iterator, end) is True
        assert m.SwigPyIterator_distance(inst.fn(first)(v), end) == 5
    # Arithmetic.
    s, begin, end = inst.samples, inst.fn("begin")(v), inst.fn("end")(v)
    assert (m.SwigPyIterator___sub__(end, begin), m.SwigPyIterator___sub__(begin, end)) == (5, -5)
    assert m.SwigPyIterator___eq__(inst.fn("iterator")(v), begin) is True
    third = m.SwigPyIterator___add__(begin, 2)
    assert (inst.value(m.SwigPyIterator_value(begin)), inst.value(m.SwigPyIterator_value(third))) == (s[0], s[2])
    back = m.SwigPyIterator___sub__(third, 1)
    moved = m.SwigPyIterator_advance(back, 2)
    assert inst.value(m.SwigPyIterator_value(back)) == s[3]
    assert moved.this.own() is False and int(moved.this) == int(back.this)  # the same object, not owned
    copy = m.SwigPyIterator_copy(back)
    m.SwigPyIterator_incr(back)
    m.SwigPyIterator_decr(copy, 2)
    assert [inst.value(m.SwigPyIterator_value(x)) for x in (back, copy)] == [s[4], s[1]] and copy.this.own() is True


def test_in_place_operators_move_the_object_and_take_ownership():
    v = m.new_vectori([10, 20, 30])
    iterator = m.vectori_begin(v)
    result = m.SwigPyIterator___iadd__(iterator, 2)
    assert m.SwigPyIterator_value(iterator) == 30 and int(result.this) == int(iterator.this)
    assert (result.this.own(), iterator.this.own()) == (True, False)
    again = m.SwigPyIterator___isub__(result, 1)
    assert m.SwigPyIterator_value(again) == 20 and (again.this.own(), result.this.own()) == (True, False)
    closed = m.vectori_iterator(v)
    pytest.raises(StopIteration, m.SwigPyIterator___iadd__, closed, 7)  # a failed move keeps the ownership
    assert closed.this.own() is True


@pytest.mark.parametrize("left, right", [("begin", "rbegin"), ("rend", "end"), ("iterator", "rbegin")])
def test_different_kinds_do_not_relate(left, right):
    v = m.new_vectord([1.0, 2.0])
    for a, b in [(getattr(m, "vectord_" + left)(v), getattr(m, "vectord_" + right)(v)),
                 (m.vectord_begin(v), m.vectorf_begin(m.new_vectorf()))]:  # another kind, another vector type
        for operator in (m.SwigPyIterator___eq__, m.SwigPyIterator___ne__, m.SwigPyIterator___sub__):
            raises(ValueError, "bad iterator type", operator, a, b)
        for relation in (m.SwigPyIterator_distance, m.SwigPyIterator_equal):  # raise the native exception itself
            assert "std::invalid_argument" in repr(pytest.raises(RuntimeError, relation, a, b).value.args[0])


def unowned(proxy):
    """A proxy that lives to the interpreter's exit, disowned: its vector is not reported there as a leak."""
    proxy.disown()
    return proxy


@pytest.mark.parametrize("operator", ["__eq__", "__ne__", "__add__", "__sub__"])
@pytest.mark.parametrize("other", [3.5, unowned(m.new_vectord())])
def test_operators_answer_not_implemented(operator, other):
    iterator = m.vectord_begin(m.new_vectord([1.0]))
    assert getattr(m, "SwigPyIterator_" + operator)(iterator, other) is NotImplemented
    assert getattr(m, "SwigPyIterator_" + operator)(other, iterator) is NotImplemented
    assert sys.exc_info() == (None, None, None)


# (name, second argument or () to pass only 1.5) -> exception and text
@pytest.mark.parametrize("name, second, error, text", [
    (name, None, ValueError, f"invalid null reference in method 'SwigPyIterator_{name}', argument 2 of type "
                             "'swig::SwigPyIterator const &'") for name in ("distance", "__eq__")
] + [
    ("value", (), TypeError, "in method 'SwigPyIterator_value', argument 1 of type 'swig::SwigPyIterator const *'"),
    ("next", (), TypeError, "in method 'SwigPyIterator_next', argument 1 of type 'swig::SwigPyIterator *'"),
    ("advance", "1", TypeError, "in method 'SwigPyIterator_advance', argument 2 of type 'ptrdiff_t'"),
])
def test_argument_messages(name, second, error, text):
    args = (1.5,) if second == () else (m.vectord_begin(m.new_vectord([1.0])), second)
    raises(error, text, getattr(m, "SwigPyIterator_" + name), *args)


@pytest.mark.parametrize("name", ["incr", "decr"])
@pytest.mark.parametrize("args", [(1, 2), (-1,), ("1",), ()])
def test_incr_and_decr_overloads(name, args):
    iterator = m.vectord_begin(m.new_vectord([1.0]))
    expected = overload_text(f"SwigPyIterator_{name}", f"swig::SwigPyIterator::{name}(size_t)", f"swig::SwigPyIterator::{name}()")
    count = f"SwigPyIterator_{name} expected at most 2 arguments, got 3\nAdditional information:\n"
    raises(TypeError, (count if len(args) == 2 else "") + expected, getattr(m, "SwigPyIterator_" + name),
           *((iterator,) + args if args else (3,)))


def test_only_the_closed_iterator_keeps_its_vector():
    vector = companion.classes["vectord"]()
    before = sys.getrefcount(vector)
    iterator = m.vectord_iterator(vector)
    copy, open_iterator = m.SwigPyIterator_copy(iterator), m.vectord_begin(vector)
    assert sys.getrefcount(vector) == before + 2
    assert m.delete_SwigPyIterator(iterator) is None and m.delete_SwigPyIterator(None) is None
    del copy, open_iterator
    assert sys.getrefcount(vector) == before


def test_text_values_are_owned_copies():
    v = m.new_vectorss(["one", "two"])
    first = m.SwigPyIterator_next(m.vectorss_iterator(v))
    assert m.vectorss___setitem__(v, 0, "changed") is None and m.SafeString_Value(first) == "one" and first.this.own() is True


# Positions outside the vector, and elements released under an iterator, are never read: whatever the
# documents leave undefined here is refused, and the closed iterator stops.
@pytest.mark.parametrize("start, step", [("end", 0), ("rend", 0), ("begin", -3)])
def test_an_open_iterator_outside_its_vector_reads_nothing(start, step):
    vector = m.new_vectord([1.0, 2.0])
    iterator = getattr(m, "vectord_" + start)(vector)
    for _ in range(3):
        m.SwigPyIterator_advance(iterator, step)
        pytest.raises(StopIteration, m.SwigPyIterator_value, iterator)


@by_instance
def test_iterators_over_released_elements_read_nothing(inst):
    vector = inst.make()
    closed, open_iterator = inst.fn("iterator")(vector), inst.fn("begin")(vector)
    inst.fn("clear")(vector)
    inst.fn("reserve")(vector, 100000)  # the elements they walked are gone
    pytest.raises(StopIteration, m.SwigPyIterator_value, closed)
    pytest.raises((StopIteration, IndexError), m.SwigPyIterator_value, open_iterator)
    pytest.raises((StopIteration, IndexError), inst.fn("insert"), vector, open_iterator, inst.samples[0])
