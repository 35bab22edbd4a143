"""Script sequences and vector proxies where a whole vector is expected."""
import array
import collections
import sys

import pytest

import _Client3 as m
import companion
from conftest import raises
from fuzzcalls import Hostile, Sequence  # a plain script sequence, and an object whose every conversion raises
from test_vectors import INSTANCES, by_instance


class Growing(Sequence):
    """Appends an element each time its last element is read, up to five elements."""

    def __getitem__(self, index):
        if index == len(self.items) - 1 and len(self.items) < 5:
            self.items.append(self.items[index] + 1.0)
        return self.items[index]


class Fickle(Sequence):
    """Its element 1 turns into text after the first complete reading."""

    reads = 0

    def __getitem__(self, index):
        self.reads += index == 1
        return "text" if index == 1 and self.reads > 1 else self.items[index]


class Recorded(Exception):
    """Keeps the text of every exception of its kind that is made."""

    texts = []

    def __init__(self, text):
        super().__init__(text)
        self.texts.append(text)


class Withdrawn(Sequence):
    """Its element `gone` reads well once; read again, it raises Recorded."""

    def __init__(self, items, gone):
        super().__init__(items)
        self.gone, self.reads = gone, 0

    def __getitem__(self, index):
        self.reads += index == self.gone
        if index == self.gone and self.reads > 1:
            raise Recorded("gone")
        return self.items[index]


@by_instance
def test_any_sequence_of_convertible_elements_and_own_vectors(inst):
    for kind in (list, tuple, Sequence):
        assert inst.read(inst.new(kind(inst.samples))) == inst.samples and inst.read(inst.new(kind([]))) == []
    # An instance of the vector's class (a bare proxy is the copy constructor's case in test_vectors).
    assert inst.read(inst.new(companion.classes[inst.prefix](inst.samples[:2]))) == inst.samples[:2]


@by_instance
def test_other_instances_proxy_is_not_read_as_a_sequence(inst):
    other = INSTANCES[(INSTANCES.index(inst) + 1) % len(INSTANCES)]

    class ListLike(companion.classes[other.prefix]):
        def __len__(self):
            return 1

        def __getitem__(self, index):
            return [inst.samples[0]][index]

    source = ListLike()
    assert inst.read(inst.new(list(source))) == inst.samples[:1]  # its items would convert
    raises(TypeError, inst.new_refused, inst.new, source)


@by_instance
def test_refused_sources_leave_only_the_overload_message(inst):
    """Objects that are no sequence, sequences that fail, and sequences with one refused element."""
    for source in ({0: 1}, Sequence([1], fail_at=0), Hostile(TypeError),
                   [inst.samples[0], inst.wrong], (inst.wrong,), Sequence([inst.wrong, inst.samples[0]])):
        raises(TypeError, inst.new_refused, inst.new, source)


def whole_vector_arguments(inst, v):
    """Each function that takes a whole vector by const reference: its name, the arguments before the
    vector, the vector's argument number and its type as the messages spell it."""
    return [(f"new_{inst.prefix}", (), 1, f"{inst.container} const &"),
            (f"{inst.prefix}___setslice__", (v, 0, 2), 4, f"{inst.source} const &"),
            (f"{inst.prefix}___setitem__", (v, slice(0, 2)), 3, f"{inst.source} const &")]


@by_instance
def test_none_is_a_null_reference(inst):
    v = inst.make()
    for name, before, position, spelling in whole_vector_arguments(inst, v):
        raises(ValueError, f"invalid null reference in method '{name}', argument {position} of type '{spelling}'",
               getattr(m, name), *before, None)
    assert inst.read(v) == inst.samples


# A str is a sequence of its characters; bytes elements are taken as they stand, texts cut at a NUL.
# (Numeric elements go through the scalar conversions of test_records.)
@pytest.mark.parametrize("source, expected", [
    ("ab", ["a", "b"]),
    ([b"bytes", "t\u00e9xt", "a\x00b"], ["bytes", "t\u00e9xt", "a"]),
])
def test_text_elements(source, expected):
    texts = next(inst for inst in INSTANCES if inst.text)
    assert texts.read(texts.new(source)) == expected


def test_length_is_asked_again_before_every_element():
    v = m.new_vectord(Growing([1.0, 2.0]))
    assert [m.vectord___getitem__(v, i) for i in range(m.vectord_size(v))] == [1.0, 2.0, 3.0, 4.0, 5.0]


@pytest.mark.parametrize("prefix, source", [
    ("vectord", lambda: Fickle([1.0, 2.0, 3.0])),
    ("vectorss", lambda: ["\ud800"]),
], ids=["changing sequence", "unencodable text"])
def test_element_that_fails_only_in_conversion_is_reported_against_the_argument(prefix, source):
    inst = next(i for i in INSTANCES if i.prefix == prefix)
    v = inst.make()
    for name, before, position, spelling in whole_vector_arguments(inst, v):
        raises(TypeError, f"in method '{name}', argument {position} of type '{spelling}'",
               getattr(m, name), *before, source())
    assert inst.read(v) == inst.samples


@pytest.mark.parametrize("gone", [0, 2, 4])
def test_the_element_that_failed_is_named_by_its_position(gone):
    """The position is added to the element's error on its way out. The argument's message then replaces that
    error, so only an exception class of the script's own sees the texts added to it."""
    Recorded.texts.clear()
    try:
        raise LookupError  # while one is handled, every exception raised is made at once, and so seen by Recorded
    except LookupError:
        raises(TypeError, "in method 'new_vectord', argument 1 of type 'std::vector< double > const &'",
               m.new_vectord, Withdrawn([0.5] * 5, gone))
    added = f"gone in sequence element {gone} "
    assert Recorded.texts == ["gone", added, added + " bad type"]


ITEMS = [float(i) + 0.5 for i in range(5)]  # objects of this test alone, so their counts are its own
REFUSED = "refused"


@pytest.mark.parametrize("source, accepted", [
    (lambda: range(200, 205), True),  # small integers: the same objects at every reading
    (lambda: collections.deque(ITEMS), True),
    (lambda: Sequence(ITEMS), True),
    (lambda: collections.deque(ITEMS[:2] + [REFUSED] + ITEMS[2:]), False),  # refused part-way by the check
    (lambda: Sequence(ITEMS[:2] + [REFUSED] + ITEMS[2:]), False),
    (lambda: Fickle(ITEMS), False),  # refused part-way by the conversion
], ids=["range", "deque", "sequence", "deque refused", "sequence refused", "sequence refused late"])
def test_elements_read_from_a_sequence_are_released(source, accepted):
    items = list(range(200, 205)) + ITEMS + [REFUSED, "text"]  # "text": what Fickle's element 1 turns into
    before = [sys.getrefcount(item) for item in items]
    for _ in range(100):
        if accepted:
            assert m.vectord_size(m.new_vectord(source())) == 5
        else:
            pytest.raises(TypeError, m.new_vectord, source())
    assert [sys.getrefcount(item) for item in items] == before


def outcome(inst, source):
    """What making a vector from `source` gives: its contents, or the refusal's type and text."""
    try:
        return inst.read(inst.new(source))
    except (TypeError, OverflowError) as error:
        return type(error), str(error)


def extremes(code):
    if code in "fd":
        return [0.5, -2.25, 3.0e38 if code == "f" else 1e300]
    bits = array.array(code).itemsize * 8
    return [0, 2 ** bits - 1] if code.isupper() else [-(2 ** (bits - 1)), 2 ** (bits - 1) - 1]


@pytest.mark.parametrize("inst", [i for i in INSTANCES if not i.text], ids=lambda inst: inst.prefix)
@pytest.mark.parametrize("code", "bBhHiIlLqQfd")
def test_arrays_convert_as_lists_of_their_items(inst, code):
    source = array.array(code, extremes(code))
    assert outcome(inst, source) == outcome(inst, list(source))
    assert outcome(inst, array.array(code)) == []


def test_an_array_subclass_is_read_through_its_own_items():
    class Doubled(array.array):
        def __getitem__(self, index):
            return 2 * super().__getitem__(index)

    assert m.vectord___getitem__(m.new_vectord(Doubled("d", [1.0, 2.5])), 1) == 5.0
