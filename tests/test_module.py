"""The module as a whole: its dictionary of functions and constants. (Bad input to every function:
test_fuzzcalls.py.)"""
import types

import _Client3

CONSTANTS = [("Success", 0), ("UnknownStatus", 1), ("NotConnected", 1000), ("RequestTimedOut", 1001),
             ("ReplyParsingError", 1002), ("ApplicationError", 1003), ("InvalidFrameNumber", 1004),
             ("ConversionError", 1005), ("ExpectedOneFrame", 1006)]


def test_dictionary_holds_functions_then_the_constants():
    assert _Client3.__name__ == "_Client3" and _Client3.__doc__ is None
    items = [(name, value) for name, value in vars(_Client3).items() if not name.startswith("__")]
    names = [name for name, value in items if isinstance(value, types.BuiltinFunctionType)]
    assert names and [name for name, _ in items[: len(names)]] == names
    for name in names:
        assert getattr(_Client3, name).__self__ is _Client3, name
    assert items[len(names):] == CONSTANTS and all(type(value) is int for _, value in items[len(names):])
    # Every class made by scripts has an initialisation function.
    registered = {name[: -len("_swigregister")] for name in names if name.endswith("_swigregister")}
    initialised = {name[: -len("_swiginit")] for name in names if name.endswith("_swiginit")}
    assert "SafeString" in registered and initialised == {cls for cls in registered if "new_" + cls in names}
