"""The pointer proxy objects: representation, comparison, ownership, chains, destruction and the
packed values."""
import operator
import os
import struct
import sys

import pytest

import _Client3
import companion
from conftest import raises, run_python
from peer import build

SAFE_STRING = "_p_ZarvoSDKClientCPP__SafeString"
NO_SHADOW, OWN = 2, 1
SAFE_STRING_NAME = "std::vector< ZarvoSDKClientCPP::SafeString >::value_type *"
LEAK = "swig/python detected a memory leak of type '{}', no destructor found.\n"


def shown(proxy, name):
    return "<Swig Object of type '%s' at %#x>" % (name, id(proxy))


@pytest.mark.parametrize("mangled, name", [
    # (The six vectors' names: test_vectors.)
    (SAFE_STRING, SAFE_STRING_NAME), ("_p_int", "LONG32 *"),
    ("_p_std__vectorT_ZarvoSDKClientCPP__Type_Parameter_std__allocatorT_ZarvoSDKClientCPP__Type_Parameter_t_t",
     "std::vector< ZarvoSDKClientCPP::Type_Parameter,std::allocator< ZarvoSDKClientCPP::Type_Parameter > > *"),
    ("_p_ZarvoSDKClientCPP__ZarvoPelluxPostClient", "ZarvoSDKClientCPP::ZarvoPelluxPostClient *"),
    # No readable names: the mangled name is shown.
    ("_p_ZarvoSDKClientCPP__Output_GetJointDetails", "_p_ZarvoSDKClientCPP__Output_GetJointDetails"), (None, "unknown"),
])
def test_repr_shows_the_last_readable_name(peer, mangled, name):
    proxy = peer.make(mangled, 0x1000, NO_SHADOW)
    assert repr(proxy) == shown(proxy, name) == proxy.__repr__() == str(proxy)


def test_repr_of_module_made_proxy_and_of_a_chain(peer):
    first, second, third = (_Client3.new_SafeString(), peer.make("_p_int", 0x2000, NO_SHADOW),
                            peer.make("_p_char", 0x3000, NO_SHADOW))
    assert repr(first) == shown(first, SAFE_STRING_NAME) and second.append(third) is None and first.append(second) is None
    assert repr(first) == shown(first, SAFE_STRING_NAME) + shown(second, "LONG32 *") + shown(third, "char *")


@pytest.mark.parametrize("loop", [1, 2])
def test_repr_of_a_chain_that_loops_shows_each_proxy_once(loop):
    proxies = [_Client3.new_SafeString() for _ in range(loop)]
    for proxy, following in zip(proxies, proxies[1:] + proxies[:1]):
        proxy.append(following)
    assert repr(proxies[0]) == "".join(shown(proxy, SAFE_STRING_NAME) for proxy in proxies)


# The descriptors take no part.
@pytest.mark.parametrize("left, right, equal", [
    ((SAFE_STRING, 0x10), (SAFE_STRING, 0x10), True), ((SAFE_STRING, 0x10), ("_p_int", 0x10), True),
    ((SAFE_STRING, 0x10), (SAFE_STRING, 0x18), False),
])
def test_equality_compares_addresses_and_there_is_no_ordering(peer, left, right, equal):
    a, b = peer.make(left[0], left[1], NO_SHADOW), peer.make(right[0], right[1], NO_SHADOW)
    assert (a == b) is equal and (a != b) is (not equal) and (b == a) is equal
    for compare in (operator.lt, operator.le, operator.gt, operator.ge):
        pytest.raises(TypeError, compare, a, b)


@pytest.mark.parametrize("address", [1, 2**64 - 1])
def test_int_is_the_native_address(peer, address):
    assert int(peer.make("_p_int", address, NO_SHADOW)) == address
    assert peer.make("_p_int", 0, NO_SHADOW | OWN) is None  # a null address makes None


def test_an_object_laid_out_like_a_proxy_is_not_read_as_one(peer):
    """A complex number's two halves lie where a proxy keeps its address and its type: here, those of
    a real string. Only a proxy's own type makes an object a proxy."""
    real = _Client3.new_SafeString("walk")
    lookalike = complex(*struct.unpack("dd", struct.pack("QQ", int(real), peer.proxy_type(real))))
    raises(TypeError, "in method 'SafeString_Value', argument 1 of type 'ZarvoSDKClientCPP::SafeString const *'",
           _Client3.SafeString_Value, lookalike)


# (flags made with, calls as (method, args), results, ownership after)
@pytest.mark.parametrize("flags, calls, results, owning", [
    (OWN, [("own", ())], [True], True), (OWN, [("own", (0,)), ("own", ())], [True, False], False),
    (0, [("own", (1,)), ("own", ())], [False, True], True), (0, [("own", ("yes",))], [False], True),
    (OWN, [("own", ([],))], [True], False), (OWN, [("disown", ()), ("own", ())], [None, False], False),
    (0, [("acquire", ()), ("acquire", ())], [None, None], True),
])
def test_ownership_methods(peer, flags, calls, results, owning):
    proxy = peer.make("_p_int", 0x40, NO_SHADOW | flags)
    try:
        assert [getattr(proxy, name)(*args) for name, args in calls] == results and proxy.own() is owning
    finally:
        proxy.disown()  # the fake address must never reach a destructor


def test_own_refusals(peer):
    proxy = _Client3.new_SafeString()
    raises(TypeError, "own expected at most 1 arguments, got 2", proxy.own, 1, 2)
    assert proxy.own() is True
    # A failing truth value still sets ownership, and its error is kept.
    proxy = peer.make("_p_int", 0x40, NO_SHADOW)
    raised = pytest.raises(SystemError, proxy.own, type("Bad", (), {"__bool__": lambda self: 1 / 0})())
    assert isinstance(raised.value.__cause__, ZeroDivisionError) and proxy.own() is True
    proxy.disown()


def test_append_and_next(peer):
    proxy, first, second = _Client3.new_SafeString(), peer.make("_p_int", 0x50, NO_SHADOW), _Client3.new_SafeString()
    assert proxy.next() is None and proxy.append(first) is None and proxy.next() is first
    before = sys.getrefcount(first)
    assert proxy.append(second) is None and proxy.next() is second
    assert sys.getrefcount(first) == before  # the replaced link is not released
    for other in (5, None, "this", object(), companion.classes["SafeString"]()):
        raises(TypeError, "Attempt to append a non SwigPyObject", proxy.append, other)
        assert proxy.next() is second


# ---- Destruction --------------------------------------------------------------------------------


@pytest.mark.parametrize("pending", [False, True])
def test_python_destroy_gets_a_temporary_non_owning_proxy(safe_string_class, pending):
    seen = []

    def destroy(proxy):
        seen.append((type(proxy).__name__, int(proxy), proxy.own(), repr(proxy).split(" at ")[0], sys.exc_info()[0]))
        _Client3.delete_SafeString(proxy)

    _Client3.SafeString_swigregister(type("SafeString", (), {"__swig_destroy__": destroy}))
    proxies = [_Client3.new_SafeString()]
    address = int(proxies[0])
    if pending:  # the argument tuple, the last holder, goes while the TypeError is pending: it is set aside
        with pytest.raises(TypeError, match="^in method 'ToString'"):
            _Client3.ToString(proxies.pop())
    else:
        del proxies[0]
    # Disowned proxies are not destroyed (the delete function takes ownership away first).
    for disown in (lambda proxy: proxy.disown(), _Client3.delete_SafeString):
        proxy = _Client3.new_SafeString()
        disown(proxy)
        del proxy
    assert seen == [("SwigPyObject", address, False, f"<Swig Object of type '{SAFE_STRING_NAME}'", None)]


@pytest.mark.parametrize("builtin", [False, True])
def test_failing_destroy_is_reported_and_the_pending_error_kept(monkeypatch, safe_string_class, builtin):
    reports = []
    monkeypatch.setattr(sys, "unraisablehook", reports.append)

    def failing(proxy):
        _Client3.delete_SafeString(proxy)
        raise KeyError("destroy failed")

    # A built-in one-object function is called directly with the dying proxy; len refuses it.
    destroy = len if builtin else failing
    _Client3.SafeString_swigregister(type("SafeString", (), {"__swig_destroy__": destroy}))
    # The argument tuple, and with it the owning proxy, is released while the TypeError is pending.
    with pytest.raises(TypeError) as raised:  # (the call must hold the only reference to the proxy)
        _Client3.ToString(_Client3.new_SafeString())
    assert str(raised.value) == "in method 'ToString', argument 1 of type 'ZarvoSDKClientCPP::ResultCode::Enum'"
    assert [(report.object, type(report.exc_value)) for report in reports] == [(destroy, TypeError if builtin else KeyError)]
    assert not builtin or "SwigPyObject" in str(reports[0].exc_value)


REGISTER = "_Client3.SafeString_swigregister(type('S', (), {%s})); "


@pytest.mark.parametrize("body, output", [
    # Owned and never registered, or registered without a destructor: one leak line, nothing destroyed.
    ("p = _Client3.new_SafeString(); del p", LEAK.format(SAFE_STRING_NAME)),
    ("p = _Client3.new_SafeString(); p.disown(); del p", ""),
    (REGISTER % "" + "p = _Client3.new_SafeString(); del p", LEAK.format(SAFE_STRING_NAME)),
    # Registered with the delete function: destroyed, no line.
    (REGISTER % "'__swig_destroy__': _Client3.delete_SafeString" + "[_Client3.new_SafeString() for i in range(1000)]", ""),
    ("p = peer.make(None, 64, 3); del p", LEAK.format("unknown")),
    # A proxy that acquired ownership later leaks like any other owner.
    ("p = peer.make('_p_char', 64, 2); p.acquire(); del p", LEAK.format("char *")),
    # Every class that scripts make and delete (the records among them) has its destructor: no line.
    ("sys.path.insert(0, %r); import companion; c = companion.register()\n"
     "for n in [n for n in c if hasattr(_Client3, 'new_' + n) and hasattr(_Client3, 'delete_' + n)] * 3:\n"
     "    r = c[n](); getattr(_Client3, 'delete_' + n)(getattr(_Client3, 'new_' + n)()); del r" % os.path.dirname(__file__), ""),
])
def test_leak_line(peer, body, output):
    assert run_python("import _Client3\n" + build.import_lines(peer.__file__) + body) == (0, output, "")


# ---- Packed values ------------------------------------------------------------------------------


# 2 * 511 + 2 = 1024 characters still fit.
@pytest.mark.parametrize("data, hexadecimal", [(b"", ""), (b"\x01\xab\x00\xff", "01ab00ff"),
                                               (bytes(range(16)), "000102030405060708090a0b0c0d0e0f"),
                                               (b"\x5a" * 511, "5a" * 511), (b"\x5a" * 512, None)])
def test_packed_representation(peer, data, hexadecimal):
    packed = peer.packed(data, "_p_int")
    assert (type(packed).__name__, type(packed).__doc__) == ("SwigPyPacked", "Swig object carries a C/C++ instance pointer")
    if hexadecimal is None:  # too long: the name alone
        assert (repr(packed), str(packed)) == ("<Swig Packed _p_int>", "_p_int")
    else:
        assert (repr(packed), str(packed)) == (f"<Swig Packed at _{hexadecimal}_p_int>", f"_{hexadecimal}_p_int")
