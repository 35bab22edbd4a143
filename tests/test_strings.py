"""SafeString: the module's SafeString functions, ToString, and text conversion in both
directions."""
import pytest

import _Client3
import companion
from peer import build

SAFE_STRING = "_p_ZarvoSDKClientCPP__SafeString"
TEXT_FUNCTIONS = ["SafeString_Value", "SafeString___str__", "SafeString___repr__"]


def test_default_safe_string():
    proxy = _Client3.new_SafeString()
    assert type(proxy).__name__ == "SwigPyObject"
    assert proxy.own() is True
    assert _Client3.SafeString_IsEmpty(proxy) is True
    assert [getattr(_Client3, name)(proxy) for name in TEXT_FUNCTIONS] == ["", "", ""]
    instance = companion.classes["SafeString"]()
    assert _Client3.SafeString_IsEmpty(instance) is True
    assert _Client3.SafeString_Value(instance) == ""


@pytest.mark.parametrize(
    "data, text",
    [
        (b"abc", "abc"),
        ("h\u00e9llo \u20ac".encode(), "h\u00e9llo \u20ac"),
        (b"\xe9", "\udce9"),  # not UTF-8: a lone surrogate, never an error
        (b"a\xff\xfeb", "a\udcff\udcfeb"),
        (b"", ""),
    ],
)
def test_library_text_comes_back_as_str(peer, data, text):
    made = peer.library_text(data)
    assert type(made) is companion.classes["SafeString"]
    assert made.this.own() is True
    assert [getattr(_Client3, name)(made) for name in TEXT_FUNCTIONS] == [text] * 3
    assert _Client3.SafeString_IsEmpty(made) is (text == "")
    assert _Client3.SafeString_Value(made).encode("utf-8", "surrogateescape") == data


# What the library receives from a text argument: str as UTF-8, bytes as they stand, both cut at
# the first NUL; None stands for an empty text.
@pytest.mark.parametrize(
    "argument, received",
    [
        ("abc", b"abc"),
        ("h\u00e9llo", "h\u00e9llo".encode()),
        ("\U0001f600", "\U0001f600".encode()),
        (b"\xff\xfe", b"\xff\xfe"),
        ("ab\0cd", b"ab"),
        (b"ab\0cd", b"ab"),
        ("", None),
        (b"", None),
        (type("Text", (str,), {})("sub"), b"sub"),
        (type("Data", (bytes,), {})(b"sub"), b"sub"),
    ],
)
def test_text_argument(peer, argument, received):
    assert peer.echo(argument) == received


@pytest.mark.parametrize(
    "argument",
    [5, 1.5, None, bytearray(b"abc"), memoryview(b"abc"), ["a"], lambda: _Client3.new_SafeString(),
     lambda: companion.classes["SafeString"]()],
)
def test_text_argument_refuses_other_objects(peer, argument):
    argument = argument() if callable(argument) else argument
    with pytest.raises(TypeError) as raised:
        peer.echo(argument)
    assert str(raised.value) == "Expected string type"


def test_unencodable_text_leaves_its_error_pending(peer):
    with pytest.raises(SystemError) as raised:
        peer.echo("a\udcff")
    assert type(raised.value.__cause__) is UnicodeEncodeError


def test_new_safe_string_copy_form_refuses_a_safe_string(peer):
    for source in (_Client3.new_SafeString(), peer.library_text(b"abc")):
        with pytest.raises(TypeError) as raised:
            _Client3.new_SafeString(source)
        assert str(raised.value) == "Expected string type"


@pytest.mark.parametrize("text", ["text", "", "h\u00e9"])
def test_new_safe_string_from_text_is_an_owned_view(text):
    made = _Client3.new_SafeString(text)
    assert type(made).__name__ == "SwigPyObject"
    assert made.own() is True
    # What such a view shows is not defined; reading it must still be safe.
    assert isinstance(_Client3.SafeString_Value(made), str)
    instance = companion.classes["SafeString"](text)
    assert instance.this.own() is True


def test_delete_safe_string():
    made = _Client3.new_SafeString()
    assert _Client3.delete_SafeString(made) is None
    assert made.own() is False
    assert _Client3.delete_SafeString(None) is None
    instance = companion.classes["SafeString"]()
    assert _Client3.delete_SafeString(instance) is None
    assert instance.this.own() is False


@pytest.mark.parametrize("bad", [5, "text", object(), lambda peer: peer.make("_p_ZarvoSDKClientCPP__Type_Parameter", 16, 2)])
def test_delete_safe_string_refuses_other_objects(peer, bad):
    bad = bad(peer) if callable(bad) else bad
    with pytest.raises(TypeError) as raised:
        _Client3.delete_SafeString(bad)
    assert str(raised.value) == "in method 'delete_SafeString', argument 1 of type 'ZarvoSDKClientCPP::SafeString *'"


@pytest.mark.parametrize(
    "code, message",
    [
        (0, "OK"),
        (1000, "Unable to communicate with the host application."),
        (1001, "Host application failed to respond to the information request."),
        (1002, "Unable to interpret information sent from the host application."),
        (1003, "Host application encountered an error processing the request."),
        (1004, "Frame number specified is invalid."),
        (1005, "Unable to convert output parameter to a numeric value."),
        (1006, "Invalid number of frames returned, expected one frame."),
        (1, "Unknown Error"),
        (999, "Unknown Error"),
        (1007, "Unknown Error"),
        (-1, "Unknown Error"),
        (2**31 - 1, "Unknown Error"),
        (-(2**31), "Unknown Error"),
        (False, "OK"),
        (True, "Unknown Error"),
    ],
)
def test_to_string(code, message):
    assert _Client3.ToString(code) == message


@pytest.mark.parametrize(
    "code, exception",
    [(2**31, OverflowError), (-(2**31) - 1, OverflowError), (2**64, OverflowError),
     ("0", TypeError), (0.0, TypeError), (None, TypeError)],
)
def test_to_string_refusals(code, exception):
    with pytest.raises(exception) as raised:
        _Client3.ToString(code)
    assert str(raised.value) == "in method 'ToString', argument 1 of type 'ZarvoSDKClientCPP::ResultCode::Enum'"


def test_new_safe_string_from_a_character_pointer_proxy(peer):
    import ctypes

    text = ctypes.create_string_buffer(b"hello")
    made = _Client3.new_SafeString(peer.make("_p_char", ctypes.addressof(text), 2))
    assert type(made).__name__ == "SwigPyObject" and made.own() is True
    assert isinstance(_Client3.SafeString_Value(made), str)


def test_new_safe_string_from_none_is_a_null_reference():
    with pytest.raises(ValueError) as raised:
        _Client3.new_SafeString(None)
    assert str(raised.value) == (
        "invalid null reference in method 'new_SafeString', argument 1 of type 'std::string const &'"
    )
