"""Slices of the six vector types, compared with a small independent model of the adjustment rule."""
import itertools

import pytest

from test_vectors import by_instance
from conftest import raises

INDICES = [None, -9, -6, -5, -4, -1, 0, 1, 2, 4, 5, 6, 10, 2**70, -(2**70)]
STEPS = [None, 1, 2, 3, -1, -2, -4, 2**70]


# ---- the model ------------------------------------------------------------------------------


def triple(s, n):
    """start, stop, step of a slice against n elements: defaults filled in, negatives shifted once."""
    step = 1 if s.step is None else s.step

    def bound(i, default):
        return default if i is None else i + n if i < 0 else i

    return bound(s.start, n - 1 if step < 0 else 0), bound(s.stop, -1 if step < 0 else n), step


def adjust(i, j, step, n, insert):
    if step > 0:
        ii = 0 if i < 0 else i if i < n else (n if insert else 0)
        return ii, max(ii, 0 if j < 0 else min(j, n))
    jj = -1 if j < -1 else j if j < n else n - 1
    return max(jj, -1 if i < -1 else i if i < n else n - 1), jj


def positions(i, j, step, n, insert):
    return list(range(*adjust(i, j, step, n, insert), step))


def model_get(items, i, j, step):
    return [items[p] for p in positions(i, j, step, len(items), False)]


def model_delete(items, i, j, step):
    return [x for k, x in enumerate(items) if k not in positions(i, j, step, len(items), True)]


def model_set(items, i, j, step, source):
    """The new contents, or the ValueError text."""
    if step == 1:
        ii, jj = adjust(i, j, 1, len(items), True)
        return items[:ii] + list(source) + items[jj:]
    where = positions(i, j, step, len(items), True)
    if len(where) != len(source):
        return f"attempt to assign sequence of size {len(source)} to extended slice of size {len(where)}"
    return [dict(zip(where, source)).get(k, x) for k, x in enumerate(items)]


# ---- comparisons ----------------------------------------------------------------------------


@by_instance
@pytest.mark.parametrize("n", [0, 5])
def test_read_delete_and_assignment_follow_the_model(inst, n):
    items = inst.samples[:n]
    for s in (slice(*bounds) for bounds in itertools.product(INDICES, INDICES, STEPS)):
        v = inst.make(items)
        start, stop, step = triple(s, n)
        assert inst.read(inst.fn("__getitem__")(v, s)) == model_get(items, start, stop, step), s
        assert inst.fn("__delitem__")(v, s) is None and inst.read(v) == model_delete(items, start, stop, step), s
        w = inst.make(items)
        inst.fn("__setitem__")(w, s)  # the one-argument form deletes as well
        assert inst.read(w) == inst.read(v), s
        fits = len(positions(start, stop, step, n, True)) if step != 1 else 2
        for size in {0, fits, fits + 1}:
            source = [inst.samples[(k + 2) % 5] for k in range(size)]
            v = inst.make(items)
            expected = model_set(items, start, stop, step, source)
            if isinstance(expected, str):
                raises(ValueError, expected, inst.fn("__setitem__"), v, s, source)
                assert inst.read(v) == items
            else:
                inst.fn("__setitem__")(v, s, inst.new(source) if size % 2 else tuple(source))
                assert inst.read(v) == expected, (s, source)


@by_instance
def test_two_index_forms_follow_the_model(inst):
    items, source = inst.samples, inst.samples[1:4]
    for i, j in itertools.product(range(-7, 8), repeat=2):
        assert inst.read(inst.fn("__getslice__")(inst.make(), i, j)) == model_get(items, i, j, 1)
        ii, jj = min(max(i, 0), 5), min(max(j, 0), 5)
        for function, rest, expected in (("__setslice__", (source,), model_set(items, i, j, 1, source)),
                                         ("__setslice__", (), model_set(items, i, j, 1, [])),
                                         ("__delslice__", (), items[:ii] + items[max(ii, jj):])):
            v = inst.make()
            assert inst.fn(function)(v, i, j, *rest) is None and inst.read(v) == expected, (function, i, j)


@by_instance
# Bounds that are not integers are refused rather than read.
@pytest.mark.parametrize("s, error, text", [
    (slice(None, None, 0), ValueError, "slice step cannot be zero"), (slice(1, 3, 0), ValueError, "slice step cannot be zero"),
    (slice(1.0, 2), TypeError, None), (slice(None, None, 1.5), TypeError, None),
])
def test_refused_slices_change_nothing(inst, s, error, text):
    v = inst.make()
    for call in (lambda: inst.fn("__getitem__")(v, s), lambda: inst.fn("__setitem__")(v, s, []),
                 lambda: inst.fn("__setitem__")(v, s), lambda: inst.fn("__delitem__")(v, s)):
        assert text in (None, str(pytest.raises(error, call).value))
    assert inst.read(v) == inst.samples


@by_instance
def test_slices_copy_their_elements(inst):
    v = inst.make()
    assert inst.fn("__setitem__")(v, slice(1, 2), v) is None  # a vector assigned into itself
    assert inst.read(v) == inst.samples[:1] + inst.samples + inst.samples[2:]
    w = inst.make()
    assert inst.fn("__setitem__")(w, slice(None, None, -1), w) is None and inst.read(w) == inst.samples[::-1]
    part = inst.fn("__getitem__")(w, slice(0, 2))
    assert inst.fn("__setitem__")(w, 0, inst.samples[1]) is None
    assert inst.read(part) == inst.samples[:-3:-1] and part.this.own() is True
