"""The record families: calling conventions, argument checks, field access and, through the fields, the
scalar conversions."""
import math
import struct

import pytest

import _Client3 as m
from conftest import raises

NS = "ZarvoSDKClientCPP::"
KINDS = {"i": "int", "u": "unsigned int", "q": "unsigned long long", "b": "bool", "f": "float", "d": "double",
         "e": NS + "ResultCode::Enum", "s": NS + "SafeString *"}
ELEMENTS = {"b": "bool", "i": "int", "q": "unsigned long long", "f": "float", "d": "double",
            "s": NS + "SafeString", "p": NS + "Type_Parameter"}

# Every record in table order: name, its fields in order as "Field:kind" (a kind letter of KINDS, or
# "v" and an element letter of ELEMENTS for a vector), and its member functions after "()".
# Records marked "+" are constructible by scripts.
TABLE = """
+Type_Parameter Name:s Value:s
Output_Result Result:e ResultString:s () Error
Output_ProcessRequest OutputParameters:vp
Output_GetServerInfo Program:s MajorVersion:u MinorVersion:u PointVersion:u ReleaseType:s
Output_GetCommandList Commands:vs
Output_GetCommandInfo Name:s Description:s InputParameters:vp OutputParameters:vp () DefaultOutputString
Output_GetSceneName Name:s Path:s
Output_GetSubjectNames Names:vs Models:vs Active:vb
Output_GetMarkerNames Names:vs
Output_HasTrajectory Exists:b
Output_GetTrajectory X:vd Y:vd Z:vd E:vb
Output_GetTrajectoryAtFrame X:d Y:d Z:d E:b
Output_GetBoneNames Names:vs
Output_GetRootBone Name:s
Output_GetBoneDetails Parent:s Children:vs
Output_GetConstraintNames Names:vs
Output_GetConstraintDetails Active:b Source:s Target:s Offset:vf Type:s
Output_GetSubjectParamNames Names:vs
Output_GetSubjectParamDetails Value:f DefaultValue:f Unit:s Required:b
Output_GetObject ID:q Type:s
Output_GetObjectList IDList:vq TypeList:vs
Output_GetIntegerList Integers:vi
Output_GetString Str:s
Output_GetAttribute Type:i Editable:b Str:s
Output_GetStringList Strings:vs
Output_GetInteger Value:i
Output_GetUnsignedLong Value:q
Output_GetUnsignedLongList ValueList:vq
Output_GetFloat Value:f
Output_GetTakeInfo Name:s Desc:s Notes:s
+Output_CircleFitSettings Enabled:b NumThreads:i EnableVideoCentroids:b
+Output_ReconstructSettings EnvironmentalDriftTolerance:d MinCamsToStartTrajectory:u MinCamsToContinueTrajectory:u
  ReconMinSeparation:d MinCentroidRadius:d MaxCentroidRadius:d MinReconstructionRadius:d MaxReconstructionRadius:d
  FitMethod:s PredicationMatchFactor:d MinTrajectoryLength:u StartupError:d PredicationError:d ComputeRadius:b
  MinVolumeX:d MinVolumeY:d MinVolumeZ:d MaxVolumeX:d MaxVolumeY:d MaxVolumeZ:d NumThreads:i
+Output_LabelingSettings UseLabelingClusters:b LabelCompletenessEntranceThreshold:d UseRobustBooting:b
  BootingQuality:d BootingVersusTracking:d TrackingQuality:d SmoothingFactor:d SinglePassLabel:b NumThreads:i
+Output_OcclusionFixingSettings Enabled:b ApplyFixedMarkers:b MarkerSmoothing:d DataFidelity:d TransitionTime:d
+Output_SolvingSettings PriorImportance:d MeanPoseRatio:d NumThreads:i ExtrapolateFingers:b FingerMultiplier:d
+Output_LabelingSubjectCalibrationSettings RestImportance:f MarkerImportance:f SegmentImportance:f Quality:s
  StatsMode:s CalibrationMode:s ActiveFrames:i AutoSaveZSK:b AutoSavePreCalHDF:b OverwriteRangeTemplates:b
  ShowCovariance:b
+Output_LabelROMSettings StandardDeviation:f SeparationDistance:f
"""


def parse(line):
    head, *rest = line.split()
    members = rest[rest.index("()") + 1:] if "()" in rest else []
    return head.lstrip("+"), head.startswith("+"), [tuple(f.split(":")) for f in rest if ":" in f], members


RECORDS = [parse(line) for line in TABLE.replace("\n  ", " ").split("\n") if line]
CREATABLE = [r for r in RECORDS if r[1]]
FIELDS = [(name, field, kind) for name, _, fields, _ in RECORDS for field, kind in fields]
CREATABLE_FIELDS = [(name, field, kind) for name, made, fields, _ in RECORDS if made for field, kind in fields]


def type_text(kind):
    element = ELEMENTS.get(kind[1:])
    return f"std::vector< {element},std::allocator< {element} > > *" if kind[0] == "v" else KINDS[kind]


def fn(name):
    return getattr(m, name)


def family(name, made, fields, methods):
    """The record's functions in table order."""
    return ([f"new_{name}"] * made + [f"delete_{name}"] + [f"{name}_{f}_{a}" for f, _ in fields for a in ("set", "get")]
            + [f"{name}_{method}" for method in methods] + [f"{name}_swigregister"] + [f"{name}_swiginit"] * made)


def text(value):
    return m.new_SafeString(value)


def library_record(peer, name):
    """A zero-filled record as the library hands one out (most records cannot be made by scripts)."""
    return peer.record("_p_ZarvoSDKClientCPP__" + name)


# ---- Calling conventions ------------------------------------------------------------------------


@pytest.mark.parametrize("record", RECORDS, ids=[r[0] for r in RECORDS])
def test_calling_conventions_and_argument_counts(record):
    name, made, fields, methods = record
    for function in family(*record):
        if function.startswith("new_"):
            raises(TypeError, f"_Client3.{function}() takes no arguments (1 given)", fn(function), 1)
        elif function.endswith("_set"):
            raises(TypeError, f"{function} expected 2 arguments, got 1", fn(function), None)
            raises(TypeError, f"{function} expected 2 arguments, got 3", fn(function), None, 1, 2)
        elif function.endswith("_swiginit"):
            raises(TypeError, "swiginit expected 2 arguments, got 1", fn(function), None)
        else:
            raises(TypeError, f"_Client3.{function}() takes exactly one argument (0 given)", fn(function))
    # delete_ takes None as a null record and refuses other objects.
    assert fn("delete_" + name)(None) is None
    raises(TypeError, f"in method 'delete_{name}', argument 1 of type '{NS}{name} *'", fn("delete_" + name), 3)


# ---- Arguments -------------------------------------------------------------------------------


@pytest.mark.parametrize("name,field,kind", FIELDS)
def test_arguments_are_checked(name, field, kind):
    for function, rest in ((f"{name}_{field}_set", (0,)), (f"{name}_{field}_get", ())):
        message = f"in method '{function}', argument 1 of type '{NS}{name} *'"
        raises(TypeError, message, fn(function), text("x"), *rest)  # a proxy of another type
    raises(ValueError, "invalid null reference " + message, fn(function), None)  # a getter cannot read a null record
    # Argument 2 of the setter: texts and vectors are references, None is a null one.
    setter, message = fn(f"{name}_{field}_set"), f"in method '{name}_{field}_set', argument 2 of type '{type_text(kind)}'"
    reference = kind == "s" or kind[0] == "v"
    for bad in ("3", None) + (3,) * reference + (text("x"),) * (kind[0] == "v"):
        error = ValueError if reference and bad is None else TypeError
        raises(error, "invalid null reference " * (error is ValueError) + message, setter, None, bad)
    if kind[0] != "v":  # a good value is converted and then stored nowhere on a null record
        assert setter(None, text("x") if kind == "s" else {"b": True, "f": 1.5, "d": 1.5}.get(kind, 1)) is None


# ---- Field access on live records -------------------------------------------------------------

def distinct(kind, number):
    """A value of the kind for the field numbered `number` of a record: no two numbers alike, flags alternating."""
    return {"b": number % 2 == 0, "f": number + 0.5, "d": number + 0.5}.get(kind, number + 1)


@pytest.mark.parametrize("name", [r[0] for r in CREATABLE if r[0] != "Type_Parameter"])
def test_scalar_fields_start_at_zero_and_hold_their_own_values(registered_classes, name):
    record = registered_classes[name]()
    fields = [(field, kind) for record_name, field, kind in CREATABLE_FIELDS if record_name == name and kind != "s"]
    assert all(fn(f"{name}_{field}_get")(record) == 0 for field, _ in fields)  # new_ zero-fills
    values = {field: distinct(kind, number) for number, (field, kind) in enumerate(fields)}
    for field, value in values.items():
        assert fn(f"{name}_{field}_set")(record, value) is None
    read = {field: fn(f"{name}_{field}_get")(record) for field in values}
    assert read == values
    assert [type(value) for value in read.values()] == [type(value) for value in values.values()]


@pytest.mark.parametrize("name,field,kind", [f for f in CREATABLE_FIELDS if f[2] == "s"])
def test_text_fields_are_borrowed_from_the_record(registered_classes, name, field, kind):
    record = registered_classes[name]()
    setter, getter = fn(f"{name}_{field}_set"), fn(f"{name}_{field}_get")
    first = getter(record)
    assert m.SafeString_IsEmpty(first) and m.SafeString_Value(first) == "" and first.this.own() is False
    setter(record, text("héllo"))
    again = getter(record)
    assert m.SafeString_Value(again) == "héllo" and int(again.this) == int(first.this)  # the same field, not a copy
    # The field proxy works as a source, including for the field itself; refused values change nothing.
    setter(record, again)
    for bad in (None, "text", 3):
        pytest.raises((TypeError, ValueError), setter, record, bad)
    assert m.SafeString_Value(getter(record)) == "héllo"
    # Into another record, the text is copied.
    other = registered_classes["Type_Parameter"]()
    m.Type_Parameter_Value_set(other, again)
    copied = m.Type_Parameter_Value_get(other)
    assert m.SafeString_Value(copied) == "héllo" and int(copied.this) != int(again.this)


@pytest.mark.parametrize("name,made", [r[:2] for r in RECORDS if r[0] != "Type_Parameter"])
def test_base_functions_accept_any_record(registered_classes, peer, name, made):
    """Script-made and library-made records alike; every non-zero result is an error."""
    record = registered_classes[name]() if made else library_record(peer, name)
    assert m.Output_Result_Result_get(record) == 0 and m.Output_Result_Error(record) is False
    for result in (1003, 1, -1, 2 ** 31 - 1, 0):
        m.Output_Result_Result_set(record, result)
        assert m.Output_Result_Result_get(record) == result and m.Output_Result_Error(record) is (result != 0)
    m.Output_Result_ResultString_set(record, text("why"))
    assert m.SafeString_Value(m.Output_Result_ResultString_get(record)) == "why"


# ---- Scalar conversion rules ------------------------------------------------------------------

Float = type("Float", (float,), {})
Index = type("Index", (), {"__index__": lambda self: 1})  # usable as an index, but not an integer


def f32(value):
    return struct.unpack("f", struct.pack("f", value))[0]


BIG = 10 ** 400
MAX_FLOAT = 3.4028234663852886e38

# Scalar conversions, one field of each kind: kind -> [(value, what the getter gives back afterwards, or the
# exception the setter raises)]. (The result code field converts as ToString's argument: test_strings.)
CONVERSIONS = {
    "i": [(True, 1), (2147483647, 2147483647), (-2147483648, -2147483648), (2147483648, OverflowError),
          (-2147483649, OverflowError), (BIG, OverflowError), (1.0, TypeError), (Index(), TypeError)],
    "u": [(4294967295, 4294967295), (True, 1), (2147483648, 2147483648), (-1, OverflowError),
          (2 ** 32, OverflowError), (1.0, TypeError), (Index(), TypeError)],
    "q": [(2 ** 64 - 1, None), (True, None), (-1, OverflowError), (2 ** 64, OverflowError), (1.0, TypeError)],
    "b": [(True, True), (False, False), (1, TypeError)],
    "d": [(1.25, 1.25), (3, 3.0), (Float(2.5), 2.5), (2 ** 53 + 1, float(2 ** 53 + 1)), (BIG, TypeError),
          ("3", TypeError), (Index(), TypeError)],
    "f": [(1.1, f32(1.1)), (MAX_FLOAT, MAX_FLOAT), (-MAX_FLOAT, -MAX_FLOAT), (math.inf, math.inf),
          (-math.inf, -math.inf), (math.nan, math.nan), (-1e39, OverflowError),
          # The smallest denormal survives; a finite value just past the largest float does not.
          (f32(1e-45), f32(1e-45)), (math.nextafter(MAX_FLOAT, math.inf), OverflowError)],
}
CASES = [(kind, value, expected) for kind, cases in CONVERSIONS.items() for value, expected in cases]


def same(a, b):
    if isinstance(b, float) and math.isnan(b):
        return isinstance(a, float) and math.isnan(a)
    return a == b and type(a) is type(b)


def scalar_field(kind):
    """A record scripts can make and the setter and getter stem of a field of the kind on it. Unsigned 64-bit
    fields are only on records scripts cannot make: that setter is exercised on a null record, which converts
    the value and stores nothing."""
    if kind == "q":
        return None, "Output_GetObject_ID"
    name, field, _ = next(f for f in CREATABLE_FIELDS if f[2] == kind)
    return name, f"{name}_{field}"


@pytest.mark.parametrize("kind,value,expected", CASES, ids=[f"{c[0]}-{c[1]!r:.20}" for c in CASES])
def test_scalar_conversion(registered_classes, kind, value, expected):
    record_name, stem = scalar_field(kind)
    setter, getter = getattr(m, stem + "_set"), getattr(m, stem + "_get")
    record = registered_classes[record_name]() if record_name else None
    before = getter(record) if record is not None else None
    if isinstance(expected, type) and issubclass(expected, Exception):
        raises(expected, f"in method '{stem}_set', argument 2 of type '{KINDS[kind]}'", setter, record, value)
        assert record is None or same(getter(record), before)  # the field keeps its value
    else:
        assert setter(record, value) is None and (record is None or same(getter(record), expected))


# ---- DefaultOutputString ----------------------------------------------------------------------

def command(peer, name, description, inputs=(), outputs=()):
    """A command description as the library hands it out."""
    record = library_record(peer, "Output_GetCommandInfo")
    if name is not None:
        m.Output_GetCommandInfo_Name_set(record, peer.library_text(name))
        m.Output_GetCommandInfo_Description_set(record, peer.library_text(description))
    for field, parameters in (("InputParameters", inputs), ("OutputParameters", outputs)):
        for parameter in parameters:
            peer.push_parameter(getattr(m, f"Output_GetCommandInfo_{field}_get")(record), *parameter)
    return record


def layout(head, inputs, outputs):
    lines = [*head, "-" * 16, "Input Parameters", "-" * 16, *(inputs or ["None"]),
             "-" * 17, "Output Parameters", "-" * 17, *(outputs or ["None"])]
    return "\n".join(lines) + "\n"


@pytest.mark.parametrize("name, description, inputs, outputs, expected", [
    ("Cmd", "Does it", [], [], layout(["Cmd", "Does it"], [], [])),
    ("Cmd", "Does it", [("Frame", "12"), ("Subject", "")], [], layout(["Cmd", "Does it"], ["Frame     12", "Subject   "], [])),
    # One column for both lists: the longest name of either, plus three.
    ("Cmd", "Does it", [("Frame", "12"), ("Subject", "")], [("LongerName", "x")],
     layout(["Cmd", "Does it"], ["Frame        12", "Subject      "], ["LongerName   x"])),
    # Null texts count as empty.
    (None, None, [], [("LongerName", "x")], layout(["", ""], [], ["LongerName   x"])),
])
def test_default_output_string_layout(peer, name, description, inputs, outputs, expected):
    assert m.Output_GetCommandInfo_DefaultOutputString(command(peer, name, description, inputs, outputs)) == expected


# ---- Records as the library hands them out -----------------------------------------------------


def test_a_text_field_keeps_its_own_copy_of_a_library_text(peer):
    record = library_record(peer, "Output_GetTakeInfo")
    m.Output_GetTakeInfo_Notes_set(record, peer.library_text("take 1"))  # the source goes at once
    assert m.SafeString_Value(m.Output_GetTakeInfo_Notes_get(record)) == "take 1"


def test_parameter_vectors_move_between_records_as_copies(peer):
    info, request = command(peer, "Cmd", "Does it", outputs=[("Frame", "12")]), library_record(peer, "Output_ProcessRequest")
    source = m.Output_GetCommandInfo_OutputParameters_get(info)
    m.Output_ProcessRequest_OutputParameters_set(request, source)
    copied = m.Output_ProcessRequest_OutputParameters_get(request)
    assert not copied.own() and copied != source
    # The copy is independent: growing the source leaves it as it was.
    peer.push_parameter(source, "Subject", "x")
    assert m.Output_GetCommandInfo_InputParameters_set(info, copied) is None
    shown = m.Output_GetCommandInfo_DefaultOutputString(info)
    assert shown.count("Frame") == 2 and "Subject   x" in shown
    # A field assigned to itself is left as it is.
    m.Output_GetCommandInfo_InputParameters_set(info, m.Output_GetCommandInfo_InputParameters_get(info))
    assert m.Output_GetCommandInfo_DefaultOutputString(info).count("Frame") == 2
