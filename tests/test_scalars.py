"""Scalar conversions, seen through record field setters and getters of each scalar kind."""
import math
import struct

import pytest

import _Client3 as m

# One field of each scalar kind: (kind, record, setter and getter stem, declared type text).
FIELDS = {
    "int": ("Output_CircleFitSettings", "Output_CircleFitSettings_NumThreads", "int"),
    "unsigned int": ("Output_ReconstructSettings", "Output_ReconstructSettings_MinCamsToStartTrajectory",
                     "unsigned int"),
    "bool": ("Output_CircleFitSettings", "Output_CircleFitSettings_Enabled", "bool"),
    "float": ("Output_LabelROMSettings", "Output_LabelROMSettings_StandardDeviation", "float"),
    "double": ("Output_SolvingSettings", "Output_SolvingSettings_PriorImportance", "double"),
    "enum": ("Output_SolvingSettings", "Output_Result_Result", "ZarvoSDKClientCPP::ResultCode::Enum"),
    # No script can construct a record with an unsigned long long field; its setters are exercised on
    # a null record, which converts the value and stores nothing.
    "unsigned long long": (None, "Output_GetObject_ID", "unsigned long long"),
}


class Int(int):
    pass


class Float(float):
    pass


class Index:
    """Usable as an index, but not an integer."""

    def __index__(self):
        return 1


def f32(value):
    return struct.unpack("f", struct.pack("f", value))[0]


BIG = 10 ** 400
MAX_FLOAT = 3.4028234663852886e38

# (kind, value, what the getter gives back afterwards, or the exception the setter raises)
CASES = [
    ("int", 0, 0), ("int", -5, -5), ("int", True, 1), ("int", False, 0), ("int", Int(7), 7),
    ("int", 2147483647, 2147483647), ("int", -2147483648, -2147483648),
    ("int", 2147483648, OverflowError), ("int", -2147483649, OverflowError), ("int", BIG, OverflowError),
    ("int", 1.0, TypeError), ("int", "3", TypeError), ("int", None, TypeError), ("int", Index(), TypeError),

    ("enum", 1003, 1003), ("enum", -1, -1), ("enum", 999, 999), ("enum", True, 1),
    ("enum", 2 ** 31, OverflowError), ("enum", -2 ** 31 - 1, OverflowError),
    ("enum", 1.0, TypeError), ("enum", "3", TypeError),

    ("unsigned int", 0, 0), ("unsigned int", 4294967295, 4294967295), ("unsigned int", True, 1),
    ("unsigned int", 2147483648, 2147483648),
    ("unsigned int", -1, OverflowError), ("unsigned int", 2 ** 32, OverflowError),
    ("unsigned int", 1.0, TypeError), ("unsigned int", "3", TypeError), ("unsigned int", Index(), TypeError),

    ("unsigned long long", 0, None), ("unsigned long long", 2 ** 64 - 1, None), ("unsigned long long", True, None),
    ("unsigned long long", -1, OverflowError), ("unsigned long long", 2 ** 64, OverflowError),
    ("unsigned long long", 1.0, TypeError), ("unsigned long long", "3", TypeError),

    ("bool", True, True), ("bool", False, False),
    ("bool", 1, TypeError), ("bool", 0, TypeError), ("bool", Int(1), TypeError), ("bool", None, TypeError),
    ("bool", "3", TypeError), ("bool", 1.0, TypeError),

    ("double", 1.25, 1.25), ("double", -1e308, -1e308), ("double", 3, 3.0), ("double", True, 1.0),
    ("double", Float(2.5), 2.5), ("double", 2 ** 53 + 1, float(2 ** 53 + 1)),
    ("double", math.inf, math.inf), ("double", -math.inf, -math.inf), ("double", math.nan, math.nan),
    ("double", BIG, TypeError), ("double", "3", TypeError), ("double", None, TypeError),
    ("double", Index(), TypeError),

    ("float", 2, 2.0), ("float", 1.1, f32(1.1)), ("float", Float(0.5), 0.5),
    ("float", MAX_FLOAT, MAX_FLOAT), ("float", -MAX_FLOAT, -MAX_FLOAT),
    ("float", math.inf, math.inf), ("float", -math.inf, -math.inf), ("float", math.nan, math.nan),
    ("float", 1e39, OverflowError), ("float", -1e39, OverflowError), ("float", 3.5e38, OverflowError),
    ("float", BIG, TypeError), ("float", "3", TypeError), ("float", None, TypeError),
]


def same(a, b):
    if isinstance(b, float) and math.isnan(b):
        return isinstance(a, float) and math.isnan(a)
    return a == b and type(a) is type(b)


@pytest.mark.parametrize("kind,value,expected", CASES, ids=[f"{c[0]}-{c[1]!r:.20}" for c in CASES])
def test_setter_conversion(registered_classes, kind, value, expected):
    record_name, stem, type_text = FIELDS[kind]
    setter, getter = getattr(m, stem + "_set"), getattr(m, stem + "_get")
    record = registered_classes[record_name]() if record_name else None
    before = getter(record) if record is not None else None
    if isinstance(expected, type) and issubclass(expected, Exception):
        with pytest.raises(expected) as caught:
            setter(record, value)
        assert type(caught.value) is expected
        assert str(caught.value) == f"in method '{stem}_set', argument 2 of type '{type_text}'"
        if record is not None:
            assert same(getter(record), before)  # the field keeps its value
    else:
        assert setter(record, value) is None
        if record is not None:
            assert same(getter(record), expected)


def test_float_is_narrowed_and_read_back_widened(registered_classes):
    record = registered_classes["Output_LabelingSubjectCalibrationSettings"]()
    m.Output_LabelingSubjectCalibrationSettings_RestImportance_set(record, 0.1)
    got = m.Output_LabelingSubjectCalibrationSettings_RestImportance_get(record)
    assert got != 0.1 and got == f32(0.1)
    # The smallest denormal float survives; a finite value just past the largest float does not.
    tiny = f32(1e-45)
    m.Output_LabelingSubjectCalibrationSettings_RestImportance_set(record, tiny)
    assert m.Output_LabelingSubjectCalibrationSettings_RestImportance_get(record) == tiny
    with pytest.raises(OverflowError):
        m.Output_LabelingSubjectCalibrationSettings_RestImportance_set(record, math.nextafter(MAX_FLOAT, math.inf))

