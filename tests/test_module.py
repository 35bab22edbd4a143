"""The module as a whole: its dictionary, constants and function families. (Bad input to every
function: test_fuzzcalls.py.)"""
import types

import _Client3

CONSTANTS = [("Success", 0), ("UnknownStatus", 1), ("NotConnected", 1000), ("RequestTimedOut", 1001),
             ("ReplyParsingError", 1002), ("ApplicationError", 1003), ("InvalidFrameNumber", 1004),
             ("ConversionError", 1005), ("ExpectedOneFrame", 1006)]
# The families by the class part of a function name, in the order the module lists them.
FAMILIES = [{"SwigPyIterator"}, {"vectorb"}, {"vectord"}, {"vectorf"}, {"vectori"}, {"vectorull"}, {"vectorss"},
            {"SafeString", "ToString"}, {"Type", "Output"}, {"ZarvoPelluxPostClient"}]
SAFE_STRING_FAMILY = ["new_SafeString", "delete_SafeString"] + [f"SafeString_{member}" for member in (
    "IsEmpty", "Value", "__str__", "__repr__", "swigregister", "swiginit")] + ["ToString"]


def family_of(name):
    base = name.removeprefix("new_").removeprefix("delete_").split("_")[0]
    return next((index for index, family in enumerate(FAMILIES) if base in family), None)


def test_dictionary_holds_functions_then_the_constants():
    assert _Client3.__name__ == "_Client3" and _Client3.__doc__ is None
    items = [(name, value) for name, value in vars(_Client3).items() if not name.startswith("__")]
    names = [name for name, value in items if isinstance(value, types.BuiltinFunctionType)]
    assert names and [name for name, _ in items[: len(names)]] == names
    for name in names:
        assert getattr(_Client3, name).__doc__ is None and getattr(_Client3, name).__self__ is _Client3, name
    assert items[len(names):] == CONSTANTS and all(type(value) is int for _, value in items[len(names):])
    # Families in order, SafeString's in full; the client facade, when present, ends the table.
    indices = [family_of(name) for name in names]
    assert None not in indices, [name for name in names if family_of(name) is None]
    assert indices == sorted(indices) and [name for name in names if family_of(name) == 7] == SAFE_STRING_FAMILY
    if "ZarvoPelluxPostClient_swiginit" in names:
        assert names[-2:] == ["ZarvoPelluxPostClient_swigregister", "ZarvoPelluxPostClient_swiginit"]
    # Every class made by scripts has an initialisation function; the vectors have no destructor function.
    registered = {name[: -len("_swigregister")] for name in names if name.endswith("_swigregister")}
    initialised = {name[: -len("_swiginit")] for name in names if name.endswith("_swiginit")}
    assert "SafeString" in registered and initialised == {cls for cls in registered if "new_" + cls in names}
    assert {cls for cls in initialised if "delete_" + cls not in names} <= {
        "vectorb", "vectord", "vectorf", "vectori", "vectorull", "vectorss"}
