"""Argument unpacking, error codes and the texts a script sees when a call goes wrong."""
import pytest

import _Client3
from conftest import overload_text, raises

OVERLOADS = overload_text("new_SafeString", *(f"ZarvoSDKClientCPP::SafeString::SafeString({p})" for p in (
    "char const *", "", "std::string const &", "ZarvoSDKClientCPP::SafeString const &")))


class Tuple(tuple):
    pass


# (argument object or None for no object, min, max) -> (result, items), or the TypeError text, or the exception
@pytest.mark.parametrize("given, low, high, expected", [
    (None, 0, 0, (1, ())), (None, 1, 1, "f expected 1 arguments, got none"),
    (None, 1, 2, "f expected at least 1 arguments, got none"), (None, 0, 2, "f expected at least 0 arguments, got none"),
    ((), 0, 0, (1, ())), ((), 1, 2, "f expected at least 1 arguments, got 0"), ((1,), 2, 2, "f expected 2 arguments, got 1"),
    ((1, 2), 3, 3, "f expected 3 arguments, got 2"), ((1, 2, 3), 0, 2, "f expected at most 2 arguments, got 3"),
    ((1, 2, 3), 2, 2, "f expected 2 arguments, got 3"), ((1,), 0, 3, (2, (1, None, None))), ((1, 2), 1, 2, (3, (1, 2))),
    (Tuple((7, 8)), 2, 2, (3, (7, 8))),
    # A bare object counts as one argument.
    (5, 1, 1, (2, (5,))), (5, 0, 3, (2, (5, None, None))), ([1, 2], 1, 2, (2, ([1, 2], None))),
    # ... but only where one argument is allowed.
] + [(5, low, high, SystemError("UnpackTuple() argument list is not a tuple")) for low, high in ((2, 2), (0, 0), (2, 3))])
def test_unpack(peer, given, low, high, expected):
    if isinstance(expected, tuple):
        assert peer.unpack(given, "f", low, high) == expected
    else:
        expected = TypeError(expected) if isinstance(expected, str) else expected
        raises(type(expected), str(expected), peer.unpack, given, "f", low, high)


def test_error_type(peer):
    expected = [RuntimeError, OSError, RuntimeError, IndexError, TypeError, ZeroDivisionError, OverflowError,
                SyntaxError, ValueError, SystemError, AttributeError, MemoryError, RuntimeError]
    assert [peer.error_type(code) for code in range(-1, -14, -1)] == expected
    assert [peer.error_type(code) for code in (-14, 0, 7)] == [RuntimeError] * 3  # unknown codes


class Unprintable(Exception):
    def __str__(self):
        raise ValueError("no text")


# (pending exception, message) -> (raised type, text); a class is raised without a value, and an old
# value without text is replaced by the message.
@pytest.mark.parametrize("pending, result", [
    (None, (RuntimeError, "more")), (ValueError("old"), (ValueError, "old more")),
    (KeyError("k"), (KeyError, "'k' more")), (IndexError, (IndexError, "more")), (Unprintable(), (Unprintable, "more")),
])
def test_add_error_msg(peer, pending, result):
    error = pytest.raises(Exception, peer.add_error_msg, pending, "more").value
    assert (type(error), error.args) == (result[0], (result[1],))


class TypeErrorKind(TypeError):
    pass


@pytest.mark.parametrize("pending, result", [
    (None, (TypeError, "msg")), (TypeError("inner"), (TypeError, "inner\nAdditional information:\nmsg")),
    (TypeErrorKind("sub"), (TypeErrorKind, "sub\nAdditional information:\nmsg")), (ValueError("other"), (TypeError, "msg")),
])
def test_raise_or_modify_type_error(peer, pending, result):
    raises(*result, peer.raise_or_modify, pending, "msg")


# ---- Through the module's own functions ---------------------------------------------------------


# A text that cannot be encoded is taken by no overload either.
@pytest.mark.parametrize("args, text", [
    ((1, 2), "new_SafeString expected at most 1 arguments, got 2\nAdditional information:\n" + OVERLOADS),
    ((1, 2, 3), "new_SafeString expected at most 1 arguments, got 3\nAdditional information:\n" + OVERLOADS),
    ((5,), OVERLOADS), ((b"bytes",), OVERLOADS), ((1.5,), OVERLOADS), (("a\udcff",), OVERLOADS),
])
def test_new_safe_string_overload_errors(args, text):
    error = raises(TypeError, text, _Client3.new_SafeString, *args)
    assert error.__cause__ is None and error.__context__ is None


SELF = "in method '{}', argument 1 of type 'ZarvoSDKClientCPP::SafeString const *'"


@pytest.mark.parametrize("name", ["SafeString_IsEmpty", "SafeString_Value", "SafeString___str__", "SafeString___repr__"])
def test_wrong_self_argument(peer, name):
    function = getattr(_Client3, name)
    for bad in (5, "text", b"text", object(), [], type(_Client3.new_SafeString()),
                peer.make("_p_ZarvoSDKClientCPP__Type_Parameter", 0x10, 2)):
        raises(TypeError, SELF.format(name), function, bad)
    # None converts to a null pointer, which is refused rather than used.
    raises(ValueError, "invalid null reference " + SELF.format(name), function, None)


@pytest.mark.parametrize("name", ["SafeString_IsEmpty", "delete_SafeString", "ToString", "SafeString_swigregister"])
def test_one_object_functions_take_exactly_one(name):
    for args in ((), (1, 2)):
        raises(TypeError, f"_Client3.{name}() takes exactly one argument ({len(args)} given)",
               getattr(_Client3, name), *args)
