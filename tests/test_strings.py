"""SafeString functions, ToString and text conversion both ways, and the texts a script sees when a
call goes wrong."""
import ctypes

import pytest

import _Client3
import companion
from conftest import overload_text, raises

TEXT_FUNCTIONS = ["SafeString_Value", "SafeString___str__", "SafeString___repr__"]


def test_default_safe_string_and_delete(peer):
    proxy, instance = _Client3.new_SafeString(), companion.classes["SafeString"]()
    assert type(proxy).__name__ == "SwigPyObject" and proxy.own() is True and instance.this.own() is True
    for made in (proxy, instance):
        assert _Client3.SafeString_IsEmpty(made) is True and [getattr(_Client3, n)(made) for n in TEXT_FUNCTIONS] == [""] * 3
        assert _Client3.delete_SafeString(made) is None
    assert proxy.own() is False and instance.this.own() is False and _Client3.delete_SafeString(None) is None
    for bad in (5, object(), peer.make("_p_ZarvoSDKClientCPP__Type_Parameter", 16, 2)):
        raises(TypeError, "in method 'delete_SafeString', argument 1 of type 'ZarvoSDKClientCPP::SafeString *'",
               _Client3.delete_SafeString, bad)


# Text that is not UTF-8 comes back with lone surrogates, never an error.
@pytest.mark.parametrize("data, text", [(b"abc", "abc"), ("h\u00e9llo \u20ac".encode(), "h\u00e9llo \u20ac"),
                                        (b"a\xff\xfeb", "a\udcff\udcfeb"), (b"", "")])
def test_library_text_comes_back_as_str(peer, data, text):
    made = peer.library_text(data)
    assert type(made) is companion.classes["SafeString"] and made.this.own() is True
    assert [getattr(_Client3, name)(made) for name in TEXT_FUNCTIONS] == [text] * 3
    assert _Client3.SafeString_IsEmpty(made) is (text == "")


# What the library receives from a text argument: str as UTF-8, bytes as they stand, both cut at
# the first NUL; None stands for an empty text.
@pytest.mark.parametrize("argument, received", [
    ("abc", b"abc"), ("h\u00e9llo", "h\u00e9llo".encode()),
    (b"\xff\xfe", b"\xff\xfe"), ("ab\0cd", b"ab"), (b"ab\0cd", b"ab"), ("", None),
    (type("Text", (str,), {})("sub"), b"sub"), (type("Data", (bytes,), {})(b"sub"), b"sub"),
])
def test_text_argument(peer, argument, received):
    assert peer.echo(argument) == received


@pytest.mark.parametrize("argument", [5, None, bytearray(b"abc"), lambda: _Client3.new_SafeString()])
def test_text_argument_refuses_other_objects(peer, argument):
    argument = argument() if callable(argument) else argument
    raises(TypeError, "Expected string type", peer.echo, argument)


def test_unencodable_text_leaves_its_error_pending(peer):
    with pytest.raises(SystemError) as raised:  # (called directly: how the pending error surfaces depends on the caller)
        peer.echo("a\udcff")
    assert type(raised.value.__cause__) is UnicodeEncodeError


def test_new_safe_string_forms(peer):
    # Texts and a character pointer proxy make owned views; what they show is not defined, but reading it is safe.
    chars = ctypes.create_string_buffer(b"hello")
    for source in ("text", "", "h\u00e9", peer.make("_p_char", ctypes.addressof(chars), 2)):
        made = _Client3.new_SafeString(source)
        assert type(made).__name__ == "SwigPyObject" and made.own() is True
        assert isinstance(_Client3.SafeString_Value(made), str)
    assert companion.classes["SafeString"]("text").this.own() is True
    # The copy form is never reached from a script: a SafeString is not text.
    for source in (_Client3.new_SafeString(), peer.library_text(b"abc")):
        raises(TypeError, "Expected string type", _Client3.new_SafeString, source)
    raises(ValueError, "invalid null reference in method 'new_SafeString', argument 1 of type 'std::string const &'",
           _Client3.new_SafeString, None)


@pytest.mark.parametrize("code, message", [
    (0, "OK"), (1000, "Unable to communicate with the host application."),
    (1001, "Host application failed to respond to the information request."),
    (1002, "Unable to interpret information sent from the host application."),
    (1003, "Host application encountered an error processing the request."),
    (1004, "Frame number specified is invalid."), (1005, "Unable to convert output parameter to a numeric value."),
    (1006, "Invalid number of frames returned, expected one frame."),
] + [(code, "Unknown Error") for code in (999, 2**31 - 1, -(2**31), True)] + [
    (2**31, OverflowError), (-(2**31) - 1, OverflowError), (2**64, OverflowError), (0.0, TypeError)])
def test_to_string(code, message):
    if isinstance(message, str):
        assert _Client3.ToString(code) == message
    else:
        raises(message, "in method 'ToString', argument 1 of type 'ZarvoSDKClientCPP::ResultCode::Enum'", _Client3.ToString, code)


# ---- The texts a script sees when a call goes wrong ----------------------------------------------

OVERLOADS = overload_text("new_SafeString", *(f"ZarvoSDKClientCPP::SafeString::SafeString({p})" for p in (
    "char const *", "", "std::string const &", "ZarvoSDKClientCPP::SafeString const &")))


# A text that cannot be encoded is taken by no overload either.
@pytest.mark.parametrize("args, text", [
    ((1, 2), "new_SafeString expected at most 1 arguments, got 2\nAdditional information:\n" + OVERLOADS),
    ((5,), OVERLOADS),
    (("a\udcff",), OVERLOADS),
])
def test_new_safe_string_overload_errors(args, text):
    error = raises(TypeError, text, _Client3.new_SafeString, *args)
    assert error.__cause__ is None and error.__context__ is None


SELF = "in method '{}', argument 1 of type 'ZarvoSDKClientCPP::SafeString const *'"


@pytest.mark.parametrize("name", ["SafeString_IsEmpty", "SafeString_Value", "SafeString___str__", "SafeString___repr__"])
def test_wrong_self_argument(peer, name):
    function = getattr(_Client3, name)
    for bad in (5, peer.make("_p_ZarvoSDKClientCPP__Type_Parameter", 0x10, 2)):
        raises(TypeError, SELF.format(name), function, bad)
    # None converts to a null pointer, which is refused rather than used.
    raises(ValueError, "invalid null reference " + SELF.format(name), function, None)

