"""The module as a whole: its dictionary, constants, function families, and bad input to every
entry point."""
import json
import os
import types

import _Client3
from conftest import run_python

CONSTANTS = [
    ("Success", 0),
    ("UnknownStatus", 1),
    ("NotConnected", 1000),
    ("RequestTimedOut", 1001),
    ("ReplyParsingError", 1002),
    ("ApplicationError", 1003),
    ("InvalidFrameNumber", 1004),
    ("ConversionError", 1005),
    ("ExpectedOneFrame", 1006),
]
# The families by the class part of a function name, in the order the module lists them.
FAMILIES = [
    {"SwigPyIterator"},
    {"vectorb"}, {"vectord"}, {"vectorf"}, {"vectori"}, {"vectorull"}, {"vectorss"},
    {"SafeString", "ToString"},
    {"Type", "Output"},
    {"ZarvoPelluxPostClient"},
]
SAFE_STRING_FAMILY = [
    "new_SafeString", "delete_SafeString", "SafeString_IsEmpty", "SafeString_Value", "SafeString___str__",
    "SafeString___repr__", "SafeString_swigregister", "SafeString_swiginit", "ToString",
]


def public_items():
    return [(name, value) for name, value in vars(_Client3).items() if not name.startswith("__")]


def functions():
    return [name for name, value in public_items() if isinstance(value, types.BuiltinFunctionType)]


def family_of(name):
    for prefix in ("new_", "delete_"):
        if name.startswith(prefix):
            name = name[len(prefix):]
    base = name.split("_")[0]
    return next((index for index, family in enumerate(FAMILIES) if base in family), None)


def test_module_identity():
    assert _Client3.__name__ == "_Client3"
    assert _Client3.__doc__ is None


def test_dictionary_holds_functions_then_the_constants():
    items = public_items()
    names = functions()
    assert names, "no functions"
    for name in names:
        function = getattr(_Client3, name)
        assert function.__doc__ is None, name
        assert function.__self__ is _Client3, name
    constants = items[len(names):]
    assert [name for name, _ in items[: len(names)]] == names
    assert constants == CONSTANTS
    assert all(type(value) is int for _, value in constants)


def test_families_appear_in_order():
    indices = [family_of(name) for name in functions()]
    assert None not in indices, [name for name in functions() if family_of(name) is None]
    assert indices == sorted(indices)
    assert [name for name in functions() if family_of(name) == 7] == SAFE_STRING_FAMILY
    if "ZarvoPelluxPostClient_swiginit" in functions():
        assert functions()[-2:] == ["ZarvoPelluxPostClient_swigregister", "ZarvoPelluxPostClient_swiginit"]


def test_registration_functions_pair_with_classes():
    names = set(functions())
    registered = {name[: -len("_swigregister")] for name in names if name.endswith("_swigregister")}
    initialised = {name[: -len("_swiginit")] for name in names if name.endswith("_swiginit")}
    assert "SafeString" in registered
    assert initialised <= registered
    assert initialised == {cls for cls in registered if "new_" + cls in names}
    # The vectors are made by scripts but have no destructor function of their own.
    assert {cls for cls in initialised if "delete_" + cls not in names} <= {
        "vectorb", "vectord", "vectorf", "vectori", "vectorull", "vectorss"}


# Every module function is called with many wrong arguments in a fresh interpreter; each call must
# either answer or raise an ordinary exception, never crash and never leave an error unreported
# (which the interpreter would turn into SystemError).
BAD_INPUT_SCRIPT = r"""
import json, sys
sys.path.insert(0, {tests!r})
import _Client3, companion
companion.register()
def samples():
    # Made afresh for every call, as a delete_ function may have destroyed the last ones.
    return [None, 0, -1, 2**31, 2**64, -(2**63) - 1, 1.5, float("nan"), "x", "", b"x", bytearray(b"x"),
            object(), [], [1, "a"], (), {{}}, _Client3.new_SafeString(), companion.classes["SafeString"](),
            type("Holder", (), {{"this": 5}})()]
problems = []
for name, function in vars(_Client3).items():
    if not callable(function) or name.startswith("__") or name.endswith(("_swigregister", "_swiginit")):
        continue
    for count in range(4):
        for index in range(len(samples())):
            args = (samples()[index],) * count
            try:
                function(*args)
            except SystemError as error:
                problems.append([name, count, repr(args[0]), str(error)])
            except Exception:
                pass
            if count == 0:
                break
print(json.dumps(problems))
"""


def test_bad_input_never_crashes_any_function():
    tests = os.path.dirname(os.path.abspath(__file__))
    rc, out, err = run_python(BAD_INPUT_SCRIPT.format(tests=tests))
    assert rc == 0, err
    assert json.loads(out.splitlines()[-1]) == []
