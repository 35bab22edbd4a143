"""The client facade's argument handling over every member, with no application running, the cases
generated from the command catalogue (each command's inputs and their wire types) and the library's
declared answers: calling conventions and counts, refusal of each argument in turn, the unconnected
answers and what a failed call leaves behind."""
import math

import pytest

import _Client3 as m
from Client3 import _catalogue, _interface
from conftest import needs_plain_allocator, raises
from repeat import resident

NS = "ZarvoSDKClientCPP::"
CLIENT = NS + "ZarvoPelluxPostClient"
NOT_CONNECTED = "Unable to communicate with the host application."
STRING = "string"  # a string argument's refusal names no type
# The text every string argument is given. As Connect's address it names host "x" with an option the
# library refuses before it looks the name up, so that no test sends a query off the machine.
TEXT = "x?no-lookup"
DOUBLES = "std::vector< double,std::allocator< double > > const &"
BOOLS = "std::vector< bool,std::allocator< bool > > const &"
PARAMETERS = f"std::vector< {NS}Type_Parameter,std::allocator< {NS}Type_Parameter > > &"
# The argument type of each wire type, as the messages spell it.
ARGUMENT_TYPES = {"String": STRING, "Int": "int", "ULong": "unsigned long long", "Bool": "bool", "Float": "float",
                  "Double": "double", "Doubles": DOUBLES, "Bools": BOOLS, "Params": PARAMETERS}
# The library's own members, which are no commands of the application.
LIBRARY = {"Connect": [STRING, "int"], "Disconnect": [], "IsConnected": [], "AllocSafeString": [STRING]}
SETTINGS = sorted({answer for answer in _interface.ANSWERS.values() if answer.endswith("Settings")})


def argument_types(command, inputs):
    """A command's argument types after the client; a settings setter takes its record whole."""
    if command.startswith("OfflineSet") and command.endswith("Settings"):
        return ["Output_" + command[len("OfflineSet"):]]
    return [ARGUMENT_TYPES[kind] for _, kind in inputs]


COMMANDS = {name: argument_types(name, inputs) for name, _, inputs, _ in _catalogue.COMMANDS}
# Every member in the library's order, with its argument types, and what it answers (a class by name,
# or bool, int, None).
SIGNATURES = {member: LIBRARY.get(member, COMMANDS.get(member)) for member in _interface.ANSWERS}
ANSWERS = {member: {"bool": bool, "int": int, "None": type(None)}.get(answer, answer)
           for member, answer in _interface.ANSWERS.items()}
WITH_ARGUMENTS = [member for member, types_ in SIGNATURES.items() if types_]


def fn(member):
    return getattr(m, "ZarvoPelluxPostClient_" + member)


def client_message(member):
    const = " const" if member == "IsConnected" else ""
    return f"in method 'ZarvoPelluxPostClient_{member}', argument 1 of type '{CLIENT}{const} *'"


class Made(str):
    """A value that is a proxy, made afresh for each test under this name."""


# Values each argument type refuses: (label, value, exception raised).
REFUSED = {
    STRING: [("int", 5, TypeError), ("None", None, TypeError), ("bytearray", bytearray(b"x"), TypeError)],
    # A float is the sharper refusal of an integer (it converts to int where a str does not).
    "int": [("float", 1.0, TypeError), ("2**40", 2**40, OverflowError), ("below", -2**31 - 1, OverflowError)],
    "unsigned long long": [("float", 1.0, TypeError), ("-1", -1, OverflowError), ("2**64", 2**64, OverflowError)],
    "bool": [("1", 1, TypeError)],  # an int is the sharper refusal (bool is a subclass of int)
    "float": [("str", "1", TypeError), ("1e39", 1e39, OverflowError)],
    "double": [("str", "1", TypeError), ("400 digits", 10**400, TypeError)],
    DOUBLES: [("None", None, ValueError), ("int", 5, TypeError), ("bad element", [1.0, "x"], TypeError),
              ("vectori", Made("vectori"), TypeError)],
    BOOLS: [("None", None, ValueError), ("int element", [True, 1], TypeError), ("vectord", Made("vectord"), TypeError)],
    PARAMETERS: [("None", None, ValueError), ("list", [], TypeError), ("record", Made("record"), TypeError)],
}
for index, name in enumerate(SETTINGS):
    REFUSED[name] = [("None", None, ValueError), ("object", object(), TypeError),
                     ("other settings", Made(SETTINGS[(index + 1) % len(SETTINGS)]), TypeError)]

# Other values each argument type accepts: (label, value).
ACCEPTED = {
    STRING: [("bytes", TEXT.encode())],
    "int": [("True", True), ("lowest", -2**31), ("highest", 2**31 - 1)],
    "unsigned long long": [("zero", 0), ("True", True)],
    "bool": [("False", False)],
    "float": [("int", 3), ("infinity", math.inf), ("nan", math.nan)],
    "double": [("int", 3), ("beyond float", 1e300)],
    DOUBLES: [("empty", [])],  # a tuple, ints and a vector proxy: test_set_trajectory_lends_its_vectors
    BOOLS: [("tuple", (False,)), ("empty", [])],
}


def position_cases(table):
    """(member, position, index into the type's row of `table`) for every argument of every member."""
    return [pytest.param(member, position, index, id=f"{member}-{position}-{label}")
            for member, types_ in SIGNATURES.items() for position, type_ in enumerate(types_, start=2)
            for index, (label, *_) in enumerate(table.get(type_, []))]


class Values:
    """Good values per argument type, and the proxies that the tables name; all kept for the whole test."""

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

    def good(self, type_):
        if type_ in SETTINGS:
            return self.made[type_]
        return {STRING: TEXT, "int": 7, "unsigned long long": 2**64 - 1, "bool": True, "float": 1.5, "double": -2.5,
                DOUBLES: [1.0, 2.0], BOOLS: [True, False], PARAMETERS: self.parameters}[type_]

    def arguments(self, member, position=None, value=None):
        """Good arguments for `member`, with `value` in place of argument `position` when one is given."""
        arguments = [self.good(type_) for type_ in SIGNATURES[member]]
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
    type_ = SIGNATURES[member][position - 2]
    if type_ == STRING:
        return "Expected string type"
    if type_ in SETTINGS:
        type_ = f"{NS}{type_} const &"
    text = f"in method 'ZarvoPelluxPostClient_{member}', argument {position} of type '{type_}'"
    return "invalid null reference " + text if exception is ValueError else text


def assert_not_connected(answer, expected, classes):
    """`answer` is what an unconnected client gives for a member whose answer is `expected` (a failed
    Connect goes on to say where and why)."""
    if isinstance(expected, type):
        assert type(answer) is expected and not answer
        return
    assert type(answer) is classes[expected] and answer.this.own() is True
    if expected != "SafeString":
        assert m.Output_Result_Result_get(answer) == m.NotConnected
        text = m.SafeString_Value(m.Output_Result_ResultString_get(answer))
        assert text == NOT_CONNECTED or text.startswith(NOT_CONNECTED + " x:") and text.endswith(
            "was not tried: 'no-lookup' is not an address option (they are timeout=MS, connect=MS and token=TEXT)")


# ---- The table and the calling conventions ----------------------------------------------------


def test_constructor_takes_no_arguments():
    raises(TypeError, "_Client3.new_ZarvoPelluxPostClient() takes no arguments (1 given)",
           m.new_ZarvoPelluxPostClient, 1)
    assert type(m.new_ZarvoPelluxPostClient()).__name__ == "SwigPyObject"  # bare: the class's __init__ adopts it


@pytest.mark.parametrize("member", [member for member, types_ in SIGNATURES.items() if not types_])
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


@pytest.mark.parametrize("member", SIGNATURES)
@pytest.mark.parametrize("stranger", ["plain object", "record", "string proxy"])
def test_argument_1_must_be_a_client(member, stranger, values, registered_classes):
    other = {"plain object": object(), "record": values.made["record"],
             "string proxy": registered_classes["SafeString"]()}[stranger]
    raises(TypeError, client_message(member), fn(member), other, *values.arguments(member))


# ---- Argument conversion -----------------------------------------------------------------------


@pytest.mark.parametrize("member,position,index", position_cases(REFUSED))
def test_a_refused_argument_names_its_position_and_type(member, position, index, client, values):
    _, value, exception = REFUSED[SIGNATURES[member][position - 2]][index]
    arguments = values.arguments(member, position, value)  # good arguments before and after it
    raises(exception, refusal(member, position, exception), fn(member), client, *arguments)


@pytest.mark.parametrize("member", [member for member in WITH_ARGUMENTS if len(SIGNATURES[member]) > 1])
def test_arguments_are_converted_left_to_right(member, client, values):
    refused = [REFUSED[type_][0] for type_ in SIGNATURES[member]]
    arguments = [values.resolve(value) for _, value, _ in refused]
    # Every argument is refused: the first one decides and the later ones are never looked at.
    raises(refused[0][2], refusal(member, 2, refused[0][2]), fn(member), client, *arguments)


@pytest.mark.parametrize("member,position,index", position_cases(ACCEPTED))
def test_other_accepted_values(member, position, index, client, values, registered_classes):
    _, value = ACCEPTED[SIGNATURES[member][position - 2]][index]
    answer = fn(member)(client, *values.arguments(member, position, value))
    assert_not_connected(answer, ANSWERS[member], registered_classes)


def surrogate_cases():
    """(member, position of a string, position of the first integer after it with only strings and bools between)."""
    cases = []
    for member, types_ in SIGNATURES.items():
        for position, type_ in enumerate(types_, start=2):
            later = [(p, t) for p, t in enumerate(types_, start=2) if p > position]
            integer = next((p for p, t in later if t in ("int", "unsigned long long")), None)
            if type_ == STRING and integer and all(t in (STRING, "bool") for p, t in later if p < integer):
                cases.append((member, position, integer))
    return cases


@pytest.mark.parametrize("member,position,integer", surrogate_cases())
def test_unencodable_str_surfaces_on_the_next_integer(member, position, integer, client, values):
    # The str's encoding error stays pending; the integer conversion finds it and reports an overflow.
    arguments = values.arguments(member, position, "bad \ud800 text")
    raises(OverflowError, refusal(member, integer, OverflowError), fn(member), client, *arguments)


# ---- Unconnected answers -------------------------------------------------------------------------


@pytest.mark.parametrize("member", SIGNATURES)
@pytest.mark.parametrize("which", ["proxy", "None"])
def test_an_unconnected_client_answers_every_member(member, which, values, registered_classes):
    # None is no client: the call still goes through and answers as an unconnected one.
    client = {"proxy": m.new_ZarvoPelluxPostClient(), "None": None}[which]
    answer = fn(member)(client, *values.arguments(member))
    assert_not_connected(answer, ANSWERS[member], registered_classes)


# ---- Vector and settings arguments ---------------------------------------------------------------


def test_set_trajectory_lends_its_vectors(client, values):
    vectord, vectorb = values.made["vectord"], values.made["vectorb"]
    answer = m.ZarvoPelluxPostClient_SetTrajectory(client, "subject", "marker", vectord, [2], (3.5,), vectorb)
    assert m.Output_Result_Result_get(answer) == m.NotConnected
    assert m.vectord_size(vectord) == 1 and m.vectord___getitem__(vectord, 0) == 1.5
    assert m.vectorb_size(vectorb) == 1 and m.vectorb___getitem__(vectorb, 0) is True


def settings_fields(record, name):
    """Every field of a settings record by getter, texts read as str."""
    getters = [n for n in dir(m) if n.startswith(name + "_") and n.endswith("_get")]
    read = {getter: getattr(m, getter)(record) for getter in getters + ["Output_Result_ResultString_get"]}
    return {getter: m.SafeString_Value(value) if type(value).__name__ == "SafeString" else value
            for getter, value in read.items()}


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
    before = resident()
    churn(200_000)
    assert resident() - before < 8_000_000  # 200,000 clients left alive would hold some 35 MB
