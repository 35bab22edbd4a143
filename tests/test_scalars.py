"""Scalar conversions, seen through record field setters and getters of each scalar kind."""
import math
import struct

import pytest

import _Client3 as m
from conftest import raises

# One field of each scalar kind (its declared type is the kind): kind -> (record to use, setter and getter stem).
# No script can construct a record with an unsigned long long field; its setter is exercised on a null record,
# which converts the value and stores nothing.
FIELDS = {"int": ("Output_CircleFitSettings", "Output_CircleFitSettings_NumThreads"),
          "unsigned int": ("Output_ReconstructSettings", "Output_ReconstructSettings_MinCamsToStartTrajectory"),
          "bool": ("Output_CircleFitSettings", "Output_CircleFitSettings_Enabled"),
          "float": ("Output_LabelROMSettings", "Output_LabelROMSettings_StandardDeviation"),
          "double": ("Output_SolvingSettings", "Output_SolvingSettings_PriorImportance"),
          "enum": ("Output_SolvingSettings", "Output_Result_Result"),
          "unsigned long long": (None, "Output_GetObject_ID")}


Int, Float = type("Int", (int,), {}), type("Float", (float,), {})
Index = type("Index", (), {"__index__": lambda self: 1})  # usable as an index, but not an integer


def f32(value):
    return struct.unpack("f", struct.pack("f", value))[0]


BIG = 10 ** 400
MAX_FLOAT = 3.4028234663852886e38

# kind: [(value, what the getter gives back afterwards, or the exception the setter raises)]
TABLE = {
    "int": [(0, 0), (-5, -5), (True, 1), (False, 0), (Int(7), 7), (2147483647, 2147483647), (-2147483648, -2147483648),
            (2147483648, OverflowError), (-2147483649, OverflowError), (BIG, OverflowError), (1.0, TypeError),
            ("3", TypeError), (None, TypeError), (Index(), TypeError)],
    "enum": [(1003, 1003), (-1, -1), (999, 999), (True, 1), (2 ** 31, OverflowError), (-2 ** 31 - 1, OverflowError),
             (1.0, TypeError), ("3", TypeError)],
    "unsigned int": [(0, 0), (4294967295, 4294967295), (True, 1), (2147483648, 2147483648), (-1, OverflowError),
                     (2 ** 32, OverflowError), (1.0, TypeError), ("3", TypeError), (Index(), TypeError)],
    "unsigned long long": [(0, None), (2 ** 64 - 1, None), (True, None), (-1, OverflowError), (2 ** 64, OverflowError),
                           (1.0, TypeError), ("3", TypeError)],
    "bool": [(True, True), (False, False), (1, TypeError), (0, TypeError), (Int(1), TypeError), (None, TypeError),
             ("3", TypeError), (1.0, TypeError)],
    "double": [(1.25, 1.25), (-1e308, -1e308), (3, 3.0), (True, 1.0), (Float(2.5), 2.5), (2 ** 53 + 1, float(2 ** 53 + 1)),
               (math.inf, math.inf), (-math.inf, -math.inf), (math.nan, math.nan), (BIG, TypeError), ("3", TypeError),
               (None, TypeError), (Index(), TypeError)],
    "float": [(2, 2.0), (1.1, f32(1.1)), (Float(0.5), 0.5), (MAX_FLOAT, MAX_FLOAT), (-MAX_FLOAT, -MAX_FLOAT),
              (math.inf, math.inf), (-math.inf, -math.inf), (math.nan, math.nan), (1e39, OverflowError),
              (-1e39, OverflowError), (3.5e38, OverflowError), (BIG, TypeError), ("3", TypeError), (None, TypeError),
              # The smallest denormal survives; a finite value just past the largest float does not.
              (f32(1e-45), f32(1e-45)), (math.nextafter(MAX_FLOAT, math.inf), OverflowError)],
}
CASES = [(kind, value, expected) for kind, cases in TABLE.items() for value, expected in cases]


def same(a, b):
    if isinstance(b, float) and math.isnan(b):
        return isinstance(a, float) and math.isnan(a)
    return a == b and type(a) is type(b)


@pytest.mark.parametrize("kind,value,expected", CASES, ids=[f"{c[0]}-{c[1]!r:.20}" for c in CASES])
def test_setter_conversion(registered_classes, kind, value, expected):
    record_name, stem = FIELDS[kind]
    setter, getter = getattr(m, stem + "_set"), getattr(m, stem + "_get")
    record = registered_classes[record_name]() if record_name else None
    before = getter(record) if record is not None else None
    if isinstance(expected, type) and issubclass(expected, Exception):
        type_text = "ZarvoSDKClientCPP::ResultCode::Enum" if kind == "enum" else kind
        raises(expected, f"in method '{stem}_set', argument 2 of type '{type_text}'", setter, record, value)
        assert record is None or same(getter(record), before)  # the field keeps its value
    else:
        assert setter(record, value) is None and (record is None or same(getter(record), expected))
