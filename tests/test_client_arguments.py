"""The client facade's argument handling, table-driven over every member, with no application running:
calling conventions and counts, refusal of each argument in turn, the unconnected answers and what a
failed call leaves behind."""
import gc
import math
import os
import socket
import sys
import types

import pytest

import _Client3 as m
from conftest import needs_plain_allocator, raises

NS = "ZarvoSDKClientCPP::"
CLIENT = NS + "ZarvoPelluxPostClient"
NOT_CONNECTED = "Unable to communicate with the host application."

# Argument kinds, each spelled as the messages name its type; strings have no type in their message.
STRING = "string"
# The text every string argument is given. As Connect's address it names host "x" with an option the
# library refuses before it looks the name up, so that no test sends a query off the machine.
TEXT = "x?no-lookup"
KINDS = {"s": STRING, "i": "int", "q": "unsigned long long", "b": "bool", "f": "float", "d": "double",
         "D": "std::vector< double,std::allocator< double > > const &",
         "B": "std::vector< bool,std::allocator< bool > > const &",
         "P": f"std::vector< {NS}Type_Parameter,std::allocator< {NS}Type_Parameter > > &"}
SETTINGS = ["Output_CircleFitSettings", "Output_ReconstructSettings", "Output_LabelROMSettings",
            "Output_LabelingSettings", "Output_LabelingSubjectCalibrationSettings",
            "Output_OcclusionFixingSettings", "Output_SolvingSettings"]

# Every member in table order: its argument kinds after the client (a letter of KINDS, or the name of
# the settings record it takes) and what it returns (a registered class by name, or bool, int, None).
TABLE = """
Connect: s i -> Output_Result
Disconnect: -> None
IsConnected: -> bool
GetCommandList: -> Output_GetCommandList
GetCommandInfo: s -> Output_GetCommandInfo
ProcessRequest: s P -> Output_ProcessRequest
AllocSafeString: s -> SafeString
GetFrameCount: -> int
SetLanguage: s -> Output_Result
PSL: s -> Output_GetString
Log: s s -> Output_Result
GetSceneName: -> Output_GetSceneName
SetSceneName: s -> bool
GetSubjectNames: -> Output_GetSubjectNames
GetMarkerNames: s -> Output_GetMarkerNames
GetBoneNames: s s -> Output_GetBoneNames
GetRootBone: s s -> Output_GetRootBone
GetBoneDetails: s s s -> Output_GetBoneDetails
GetConstraintNames: s s -> Output_GetConstraintNames
GetConstraintDetails: s s s -> Output_GetConstraintDetails
GetSubjectParamNames: s s -> Output_GetSubjectParamNames
GetSubjectParamDetails: s s s -> Output_GetSubjectParamDetails
GetTrajectory: s s -> Output_GetTrajectory
SetTrajectory: s s D D D B -> Output_Result
GetTrajectoryAtFrame: s s i -> Output_GetTrajectoryAtFrame
SetTrajectoryAtFrame: s s i d d d b -> Output_Result
SceneGetObject: s -> Output_GetObject
SceneGetObjectList: s -> Output_GetObjectList
SceneCreateObject: s s q s -> Output_GetObject
SceneRemoveObject: q s -> Output_Result
SceneSelectObject: q s i -> Output_Result
SceneSelectAllObjects: i -> Output_Result
SceneSelectObjectsOfType: s i -> Output_Result
SceneInvertObjectSelection: -> Output_Result
SceneGetSelectedObjects: -> Output_GetObjectList
SceneGetPrimarySelectedObject: -> Output_GetObject
SceneGetActiveClip: -> Output_GetString
SceneSetActiveClip: s -> Output_Result
ObjectGetAttribute: q s -> Output_GetUnsignedLong
ObjectGetAttributes: q -> Output_GetUnsignedLongList
ObjectHasAttribute: q q -> Output_GetInteger
ObjectGetAttributeValue: q s -> Output_GetAttribute
ObjectSetAttributeValue: q s s -> Output_Result
ObjectGetChannel: q s -> Output_GetAttribute
ObjectGetChannels: q -> Output_GetString
ObjectHasChannel: q q -> Output_GetInteger
ObjectGetParameter: q i s -> Output_GetUnsignedLong
ObjectGetParameters: q i -> Output_GetUnsignedLongList
ObjectHasParameter: q i q -> Output_GetInteger
ObjectGetChildren: q -> Output_GetObjectList
ObjectGetDescendants: q -> Output_GetObjectList
ObjectGetParent: q -> Output_GetObject
ObjectGetPath: q -> Output_GetString
ObjectSetParent: q q b -> Output_Result
ObjectGetType: q -> Output_GetString
ObjectSelect: q i -> Output_Result
ObjectSetConstraint: q i -> Output_Result
AttributeGetName: q q -> Output_GetString
AttributeGetValue: q q -> Output_GetAttribute
AttributeSetValue: q q s -> Output_Result
ChannelGetName: q q -> Output_GetString
ChannelGetValue: q q i i i s -> Output_GetAttribute
ChannelSetValue: q q i i i s s -> Output_Result
ChannelHasKey: q q i -> Output_GetString
ChannelSelectKeys: q q -> Output_Result
ChannelDeleteKey: q q i -> Output_Result
ChannelDeleteAllKeys: q q -> Output_Result
ChannelDeleteSelectedKeys: q q -> Output_Result
ChannelSelectKeysFromRanges: q q i -> Output_Result
ChannelSelectAllKeys: q q i -> Output_Result
ChannelInvertKeySelection: q q -> Output_Result
ChannelGetDefaultValue: q q -> Output_GetAttribute
ChannelSetDefaultValue: q q s -> Output_Result
ChannelGetGaps: q q i -> Output_GetString
ParameterGet: q q i s -> Output_GetString
ParameterSet: q q i s s -> Output_Result
ParameterCreate: q s i -> Output_GetUnsignedLong
ParameterRemove: q q s -> Output_Result
AddScriptPath: s -> Output_Result
RemoveScriptPath: s -> Output_Result
ReparseScriptPaths: -> Output_Result
NewScene: -> Output_Result
LoadFile: s -> Output_Result
ImportFile: s s b -> Output_Result
SaveFile: s s -> Output_Result
ExportFile: s s -> Output_Result
DatabaseCreate: s s -> Output_Result
DatabaseGetCurrent: s -> Output_GetString
DatabaseSetCurrent: s s -> Output_Result
DatabaseGetMarkedTakes: -> Output_GetStringList
TimelineGetTicks: -> Output_GetUnsignedLong
TimelineSetTicks: q -> Output_Result
TimelineGetSecs: -> Output_GetFloat
TimelineSetSecs: f -> Output_Result
TimelineGetFrames: -> Output_GetInteger
TimelineSetFrames: i -> Output_Result
TimelineGetPlayStart: -> Output_GetInteger
TimelineSetPlayStart: i -> Output_Result
TimelineGetPlayEnd: -> Output_GetInteger
TimelineSetPlayEnd: i -> Output_Result
TimelineGetAnimStart: -> Output_GetInteger
TimelineSetAnimStart: i -> Output_Result
TimelineGetAnimEnd: -> Output_GetInteger
TimelineSetAnimEnd: i -> Output_Result
TimelineGetTimeCodeStandard: -> Output_GetString
TimelineSetTimeCodeStandard: s -> Output_Result
TimelineGetFrameRate: -> Output_GetFloat
TimelineSetFrameRate: f -> Output_Result
TimelinePlay: -> Output_Result
TimelineStop: -> Output_Result
TimelineSelectRange: i i i -> Output_Result
TimelineSelectAll: i -> Output_Result
TimelineInvertSelection: -> Output_Result
TimelineSelectRangeFromKeys: i -> Output_Result
TimelineGetSelectedRanges: -> Output_GetIntegerList
OfflineCalibrateCameras: s -> Output_Result
OfflineLabelROM: s s -> Output_Result
OfflineReconstruct: s -> Output_Result
OfflineAutoLabel: s s -> Output_Result
OfflineCalibrateLabelingSubjects: s s -> Output_Result
OfflineCalibrateSolvingSubjects: s s -> Output_Result
OfflineFixOcclusion: s s -> Output_Result
OfflineCreateSolvingSetupFromLS: s -> Output_Result
OfflineSolve: s -> Output_Result
OfflineRetarget: s -> Output_Result
OfflineQuickPost: s s -> Output_Result
OfflineGetCircleFitSettings: -> Output_CircleFitSettings
OfflineSetCircleFitSettings: Output_CircleFitSettings -> Output_Result
OfflineGetReconstructSettings: -> Output_ReconstructSettings
OfflineSetReconstructSettings: Output_ReconstructSettings -> Output_Result
OfflineGetLabelROMSettings: -> Output_LabelROMSettings
OfflineSetLabelROMSettings: Output_LabelROMSettings -> Output_Result
OfflineGetLabelingSettings: -> Output_LabelingSettings
OfflineSetLabelingSettings: Output_LabelingSettings -> Output_Result
OfflineGetLabelingSubjectCalibrationSettings: -> Output_LabelingSubjectCalibrationSettings
OfflineSetLabelingSubjectCalibrationSettings: Output_LabelingSubjectCalibrationSettings -> Output_Result
OfflineGetOcclusionFixingSettings: -> Output_OcclusionFixingSettings
OfflineSetOcclusionFixingSettings: Output_OcclusionFixingSettings -> Output_Result
OfflineGetSolvingSettings: -> Output_SolvingSettings
OfflineSetSolvingSettings: Output_SolvingSettings -> Output_Result
FilterApplyFIR: q q s b i f f f -> Output_Result
FilterApplyWeightedAverage: q q s b i i -> Output_Result
"""
RESULTS = {"bool": bool, "int": int, "None": type(None)}


def parse(line):
    member, rest = line.split(":", 1)
    kinds, result = rest.split("->")
    kinds = [KINDS.get(token, token) for token in kinds.split()]
    return member, kinds, RESULTS.get(result.strip(), result.strip())


MEMBERS = [parse(line) for line in TABLE.strip().split("\n")]
SIGNATURES = {member: kinds for member, kinds, _ in MEMBERS}
ONE_OBJECT = [member for member, kinds, _ in MEMBERS if not kinds]
WITH_ARGUMENTS = [member for member, kinds, _ in MEMBERS if kinds]
RESULTS_OF = {member: result for member, _, result in MEMBERS}


def fn(member):
    return getattr(m, "ZarvoPelluxPostClient_" + member)


def client_message(member):
    const = " const" if member == "IsConnected" else ""
    return f"in method 'ZarvoPelluxPostClient_{member}', argument 1 of type '{CLIENT}{const} *'"


def text_of(safe_string):
    return m.SafeString_Value(safe_string)


def resident_bytes():
    with open("/proc/self/statm") as statm:
        return int(statm.read().split()[1]) * os.sysconf("SC_PAGE_SIZE")


class Made(str):
    """A value that is a proxy, made afresh for each test under this name."""


# Values each kind refuses: (label, value, exception raised).
REFUSED = {
    STRING: [("int", 5, TypeError), ("None", None, TypeError), ("bytearray", bytearray(b"x"), TypeError)],
    "int": [("str", "1", TypeError), ("float", 1.0, TypeError), ("2**40", 2**40, OverflowError),
            ("below", -2**31 - 1, OverflowError)],
    "unsigned long long": [("str", "1", TypeError), ("float", 1.0, TypeError), ("-1", -1, OverflowError),
                           ("2**64", 2**64, OverflowError)],
    "bool": [("1", 1, TypeError), ("0", 0, TypeError), ("None", None, TypeError), ("str", "True", TypeError)],
    "float": [("str", "1", TypeError), ("None", None, TypeError), ("1e39", 1e39, OverflowError)],
    "double": [("str", "1", TypeError), ("None", None, TypeError), ("400 digits", 10**400, TypeError)],
    KINDS["D"]: [("None", None, ValueError), ("int", 5, TypeError), ("bad element", [1.0, "x"], TypeError),
                 ("vectori", Made("vectori"), TypeError)],
    KINDS["B"]: [("None", None, ValueError), ("int element", [True, 1], TypeError),
                 ("vectord", Made("vectord"), TypeError)],
    KINDS["P"]: [("None", None, ValueError), ("list", [], TypeError), ("record", Made("record"), TypeError)],
}
for index, name in enumerate(SETTINGS):
    REFUSED[name] = [("None", None, ValueError), ("object", object(), TypeError),
                     ("other settings", Made(SETTINGS[(index + 1) % len(SETTINGS)]), TypeError)]

# Other values each kind accepts: (label, value).
ACCEPTED = {
    STRING: [("bytes", TEXT.encode())],
    "int": [("True", True), ("lowest", -2**31), ("highest", 2**31 - 1)],
    "unsigned long long": [("zero", 0), ("True", True)],
    "bool": [("False", False)],
    "float": [("int", 3), ("infinity", math.inf), ("nan", math.nan)],
    "double": [("int", 3), ("beyond float", 1e300)],
    KINDS["D"]: [("tuple", (1.0, 2)), ("empty", []), ("vectord", Made("vectord"))],
    KINDS["B"]: [("tuple", (False,)), ("empty", []), ("vectorb", Made("vectorb"))],
}


def position_cases(table):
    """(member, position, index into the kind's row of `table`) for every argument of every member."""
    return [pytest.param(member, position, index, id=f"{member}-{position}-{label}")
            for member, kinds, _ in MEMBERS for position, kind in enumerate(kinds, start=2)
            for index, (label, *_) in enumerate(table.get(kind, []))]


class Values:
    """Good values per argument kind, and the proxies that the tables name; all kept for the whole test."""

    def __init__(self, classes):
        self.command_info = m.ZarvoPelluxPostClient_GetCommandInfo(None, "x")
        self.parameters = m.Output_GetCommandInfo_InputParameters_get(self.command_info)
        self.made = {name: classes[name]() for name in SETTINGS + ["vectord", "vectorb", "vectori"]}
        self.made["record"] = m.ZarvoPelluxPostClient_GetCommandList(None)  # a type that no argument takes
        m.vectord_append(self.made["vectord"], 1.5)
        m.vectorb_append(self.made["vectorb"], True)

    def release(self):
        for name in ("vectord", "vectorb", "vectori"):  # vectors have no destructor function: let them go quietly
            self.made[name].this.disown()

    def resolve(self, value):
        return self.made[value] if isinstance(value, Made) else value

    def good(self, kind):
        if kind in SETTINGS:
            return self.made[kind]
        return {STRING: TEXT, "int": 7, "unsigned long long": 2**64 - 1, "bool": True, "float": 1.5,
                "double": -2.5, KINDS["D"]: [1.0, 2.0], KINDS["B"]: [True, False], KINDS["P"]: self.parameters}[kind]

    def arguments(self, member, position=None, value=None):
        """Good arguments for `member`, with `value` in place of argument `position` when one is given."""
        arguments = [self.good(kind) for kind in SIGNATURES[member]]
        if position is not None:
            arguments[position - 2] = self.resolve(value)
        return arguments


@pytest.fixture
def values(registered_classes):
    made = Values(registered_classes)
    yield made
    made.release()


@pytest.fixture
def client():
    return m.new_ZarvoPelluxPostClient()


def refusal(member, position, exception):
    """The exact text of the error that a value refused at `position` raises."""
    kind = SIGNATURES[member][position - 2]
    if kind == STRING:
        return "Expected string type"
    if kind in SETTINGS:
        kind = f"{NS}{kind} const &"
    text = f"in method 'ZarvoPelluxPostClient_{member}', argument {position} of type '{kind}'"
    return "invalid null reference " + text if exception is ValueError else text


def assert_not_connected(answer, expected, classes):
    """`answer` is what an unconnected client gives for a member whose result is `expected` (a failed
    Connect goes on to say where and why)."""
    if isinstance(expected, type):
        assert type(answer) is expected and not answer
        return
    assert type(answer) is classes[expected] and answer.this.own() is True
    if expected != "SafeString":
        assert m.Output_Result_Result_get(answer) == m.NotConnected == 1000
        text = text_of(m.Output_Result_ResultString_get(answer))
        assert text == NOT_CONNECTED or text.startswith(NOT_CONNECTED + " x:") and text.endswith(
            "was not tried: 'no-lookup' is not an address option (they are timeout=MS, connect=MS and token=TEXT)")


# ---- The table and the calling conventions ----------------------------------------------------


def test_module_has_705_functions_and_the_facade_one_per_member():
    functions = [name for name, value in vars(m).items() if isinstance(value, types.BuiltinFunctionType)]
    assert len(functions) == 705 and len(MEMBERS) == 142
    facade = [name for name in functions if "ZarvoPelluxPostClient" in name]
    assert facade == (["new_ZarvoPelluxPostClient", "delete_ZarvoPelluxPostClient"]
                      + [f"ZarvoPelluxPostClient_{member}" for member, _, _ in MEMBERS]
                      + ["ZarvoPelluxPostClient_swigregister", "ZarvoPelluxPostClient_swiginit"])


def test_constructor_takes_no_arguments():
    raises(TypeError, "_Client3.new_ZarvoPelluxPostClient() takes no arguments (1 given)",
           m.new_ZarvoPelluxPostClient, 1)
    assert type(m.new_ZarvoPelluxPostClient()).__name__ == "SwigPyObject"  # bare: the class's __init__ adopts it


@pytest.mark.parametrize("member", ONE_OBJECT)
def test_one_object_members_take_the_client_alone(member, client):
    name = "ZarvoPelluxPostClient_" + member
    raises(TypeError, f"_Client3.{name}() takes exactly one argument (2 given)", fn(member), client, client)
    raises(TypeError, f"_Client3.{name}() takes exactly one argument (0 given)", fn(member))
    # A tuple is not unpacked into arguments: it is a client of the wrong type.
    raises(TypeError, client_message(member), fn(member), (client,))


@pytest.mark.parametrize("member", WITH_ARGUMENTS)
def test_tuple_members_take_an_exact_count(member, client, values):
    arguments, count = values.arguments(member), len(SIGNATURES[member]) + 1
    expected = f"ZarvoPelluxPostClient_{member} expected {count} arguments, got %d"
    raises(TypeError, expected % (count - 1), fn(member), client, *arguments[:-1])
    raises(TypeError, expected % (count + 1), fn(member), client, *arguments, arguments[-1])
    raises(TypeError, expected % 0, fn(member))


# ---- Argument conversion -----------------------------------------------------------------------


@pytest.mark.parametrize("member,position,index", position_cases(REFUSED))
def test_a_refused_argument_names_its_position_and_type(member, position, index, client, values):
    _, value, exception = REFUSED[SIGNATURES[member][position - 2]][index]
    arguments = values.arguments(member, position, value)  # good arguments before and after it
    raises(exception, refusal(member, position, exception), fn(member), client, *arguments)


@pytest.mark.parametrize("member", [member for member in WITH_ARGUMENTS if len(SIGNATURES[member]) > 1])
def test_arguments_are_converted_left_to_right(member, client, values):
    refused = [REFUSED[kind][0] for kind in SIGNATURES[member]]
    arguments = [values.resolve(value) for _, value, _ in refused]
    # Every argument is refused: the first one decides and the later ones are never looked at.
    raises(refused[0][2], refusal(member, 2, refused[0][2]), fn(member), client, *arguments)


@pytest.mark.parametrize("member,position,index", position_cases(ACCEPTED))
def test_other_accepted_values(member, position, index, client, values, registered_classes):
    _, value = ACCEPTED[SIGNATURES[member][position - 2]][index]
    answer = fn(member)(client, *values.arguments(member, position, value))
    assert_not_connected(answer, RESULTS_OF[member], registered_classes)


@pytest.mark.parametrize("member", [member for member, _, _ in MEMBERS])
@pytest.mark.parametrize("stranger", ["plain object", "record", "string proxy"])
def test_argument_1_must_be_a_client(member, stranger, values, registered_classes):
    other = {"plain object": object(), "record": values.made["record"],
             "string proxy": registered_classes["SafeString"]()}[stranger]
    raises(TypeError, client_message(member), fn(member), other, *values.arguments(member))


def test_connect_with_a_bad_port_never_reaches_the_library(client):
    # A bare listening socket on the loopback: a call that reaches the library connects to it.
    with socket.create_server(("127.0.0.1", 0)) as listener:
        listener.settimeout(0.5)
        port, address = listener.getsockname()[1], "127.0.0.1?connect=200"
        connect = m.ZarvoPelluxPostClient_Connect
        raises(OverflowError, refusal("Connect", 3, OverflowError), connect, client, address, 2**40)
        raises(TypeError, refusal("Connect", 3, TypeError), connect, client, address, str(port))
        with pytest.raises(socket.timeout):
            listener.accept()
        # The same call with a good port does connect (and, with nobody answering, stays unconnected).
        answer = connect(client, address, port)
        listener.accept()[0].close()
        assert m.Output_Result_Result_get(answer) == m.NotConnected


def surrogate_cases():
    """(member, position of a string, position of the first integer after it with only strings and bools between)."""
    cases = []
    for member, kinds, _ in MEMBERS:
        for position, kind in enumerate(kinds, start=2):
            later = [(p, k) for p, k in enumerate(kinds, start=2) if p > position]
            integer = next((p for p, k in later if k in ("int", "unsigned long long")), None)
            if kind == STRING and integer and all(k in (STRING, "bool") for p, k in later if p < integer):
                cases.append((member, position, integer))
    return cases


SURROGATE_CASES = surrogate_cases()


@pytest.mark.parametrize("member,position,integer", SURROGATE_CASES)
def test_unencodable_str_surfaces_on_the_next_integer(member, position, integer, client, values):
    # The str's encoding error stays pending; the integer conversion finds it and reports an overflow.
    arguments = values.arguments(member, position, "bad \ud800 text")
    raises(OverflowError, refusal(member, integer, OverflowError), fn(member), client, *arguments)


def test_surrogate_cases_cover_each_shape():
    for case in [("Connect", 2, 3), ("SceneCreateObject", 2, 4), ("FilterApplyFIR", 4, 6), ("ParameterCreate", 3, 4)]:
        assert case in SURROGATE_CASES


# ---- Unconnected answers -------------------------------------------------------------------------


@pytest.mark.parametrize("member", [member for member, _, _ in MEMBERS])
@pytest.mark.parametrize("which", ["proxy", "instance", "None"])
def test_an_unconnected_client_answers_every_member(member, which, values, registered_classes):
    # None is no client: the call still goes through and answers as an unconnected one.
    client = {"proxy": m.new_ZarvoPelluxPostClient(), "instance": registered_classes["ZarvoPelluxPostClient"](),
              "None": None}[which]
    answer = fn(member)(client, *values.arguments(member))
    assert_not_connected(answer, RESULTS_OF[member], registered_classes)


@pytest.mark.parametrize("which", ["proxy", "None"])
def test_plain_answers_of_an_unconnected_client(which):
    client = m.new_ZarvoPelluxPostClient() if which == "proxy" else None
    assert m.ZarvoPelluxPostClient_IsConnected(client) is False
    assert m.ZarvoPelluxPostClient_GetFrameCount(client) == 0
    assert m.ZarvoPelluxPostClient_SetSceneName(client, "scene") is False
    assert m.ZarvoPelluxPostClient_Disconnect(client) is None
    copied = m.ZarvoPelluxPostClient_AllocSafeString(client, "caf\u00e9")
    assert text_of(copied) == "caf\u00e9" and copied.this.own() is True


# ---- Vector, parameter and settings arguments --------------------------------------------------


def test_set_trajectory_takes_lists_tuples_and_vectors(client, values):
    vectord, vectorb = values.made["vectord"], values.made["vectorb"]
    for x, y, z, e in [([1.0], [2], [3.5], [True]), ((1.0,), (2,), (3.5,), (True,)),
                       (vectord, vectord, vectord, vectorb), ([], (), vectord, [])]:
        answer = m.ZarvoPelluxPostClient_SetTrajectory(client, "subject", "marker", x, y, z, e)
        assert m.Output_Result_Result_get(answer) == m.NotConnected
    # The proxies were lent, not consumed.
    assert m.vectord_size(vectord) == 1 and m.vectord___getitem__(vectord, 0) == 1.5
    assert m.vectorb_size(vectorb) == 1 and m.vectorb___getitem__(vectorb, 0) is True


@needs_plain_allocator
def test_set_trajectory_refused_sixth_argument_leaves_no_temporary(client):
    x, y = [float(i) for i in range(100_000)], list(range(100_000))  # copied into 800 kB temporaries each call
    expected = refusal("SetTrajectory", 6, TypeError)
    references = sys.getrefcount(x), sys.getrefcount(y)
    for _ in range(5):
        raises(TypeError, expected, m.ZarvoPelluxPostClient_SetTrajectory, client, "s", "m", x, y, ["z"], [True])
    before = resident_bytes()
    for _ in range(150):
        raises(TypeError, expected, m.ZarvoPelluxPostClient_SetTrajectory, client, "s", "m", x, y, ["z"], [True])
    assert resident_bytes() - before < 40_000_000  # leaked temporaries would come to 240 MB
    gc.collect()  # the caught errors' tracebacks hold the lists until then
    assert (sys.getrefcount(x), sys.getrefcount(y)) == references


def test_process_request_takes_only_a_parameter_vector(client, values):
    kind = f"std::vector< {NS}Type_Parameter,std::allocator< {NS}Type_Parameter > > &"
    expected = f"in method 'ZarvoPelluxPostClient_ProcessRequest', argument 3 of type '{kind}'"
    raises(ValueError, "invalid null reference " + expected, m.ZarvoPelluxPostClient_ProcessRequest, client, "c", None)
    raises(TypeError, expected, m.ZarvoPelluxPostClient_ProcessRequest, client, "c", [])


def settings_fields(record, name):
    """Every field of a settings record by getter, texts read as str."""
    getters = [n for n in dir(m) if n.startswith(name + "_") and n.endswith("_get")]
    read = {getter: getattr(m, getter)(record) for getter in getters + ["Output_Result_ResultString_get"]}
    return {getter: text_of(value) if type(value).__name__ == "SafeString" else value for getter, value in read.items()}


@pytest.mark.parametrize("name", SETTINGS)
def test_settings_setter_leaves_the_record_unchanged_and_owned(name, client, values):
    record = values.made[name]
    getter = next(n for n in sorted(dir(m)) if n.startswith(name + "_") and n.endswith("_get"))
    changed = {bool: True, int: 3, float: 0.25}[type(getattr(m, getter)(record))]
    getattr(m, getter[: -len("get")] + "set")(record, changed)
    before = settings_fields(record, name)
    answer = fn("OfflineSet" + name.removeprefix("Output_"))(client, record)
    assert m.Output_Result_Result_get(answer) == m.NotConnected and answer is not record
    assert settings_fields(record, name) == before and getattr(m, getter)(record) == changed
    assert record.this.own() is True


def test_settings_setter_refuses_the_record_of_another_stage(client):
    labeling = m.ZarvoPelluxPostClient_OfflineGetLabelingSettings(client)
    raises(TypeError, "in method 'ZarvoPelluxPostClient_OfflineSetReconstructSettings', argument 2 of type "
                      f"'{NS}Output_ReconstructSettings const &'",
           m.ZarvoPelluxPostClient_OfflineSetReconstructSettings, client, labeling)


# ---- Destruction --------------------------------------------------------------------------------


def test_delete_takes_none_and_refuses_other_objects(values):
    assert m.delete_ZarvoPelluxPostClient(None) is None
    for stranger in (object(), values.made["record"]):
        raises(TypeError, f"in method 'delete_ZarvoPelluxPostClient', argument 1 of type '{CLIENT} *'",
               m.delete_ZarvoPelluxPostClient, stranger)


def test_delete_disowns_the_proxy():
    proxy = m.new_ZarvoPelluxPostClient()
    assert proxy.own() is True
    assert m.delete_ZarvoPelluxPostClient(proxy) is None and proxy.own() is False


@needs_plain_allocator
def test_delete_destroys_a_client_its_proxy_does_not_own():
    def churn(times):
        for _ in range(times):
            proxy = m.new_ZarvoPelluxPostClient()
            proxy.disown()
            m.delete_ZarvoPelluxPostClient(proxy)

    churn(1000)
    before = resident_bytes()
    churn(200_000)
    assert resident_bytes() - before < 8_000_000  # 200,000 clients left alive would hold some 35 MB
