"""Calling the application through the module for the tests of the scene, file and timeline commands:
a client connected to a host, whose operations answer with their record's fields."""
import _Client3 as m

import companion


class ApplicationError(AssertionError):
    """An operation that the application refused: its result code and message."""

    def __init__(self, code, text):
        super().__init__(f"{code}: {text}")
        self.code, self.text = code, text


def _plain(value):
    kind = type(value).__name__
    if kind == "SafeString":
        return m.SafeString_Value(value)
    if kind.startswith("vector"):
        items = [getattr(m, kind + "___getitem__")(value, i) for i in range(getattr(m, kind + "___len__")(value))]
        return [_plain(item) for item in items]
    return value


_OUTPUTS = {}


class Client:
    """`client.Op(args)` runs Op and returns its record's fields other than the result, as plain
    values (one field alone, several as a tuple); a refusal raises ApplicationError.
    `client.refusal("Op", args)` returns (code, message) of an operation that must fail."""

    def __init__(self, host):
        self.proxy = companion.classes["ZarvoPelluxPostClient"]()
        self._run("Connect", host.address, host.port)

    def record(self, operation, *args):
        return getattr(m, "ZarvoPelluxPostClient_" + operation)(self.proxy, *args)

    def _run(self, operation, *args):
        record = self.record(operation, *args)
        if not type(record).__name__.startswith("Output_"):
            return record  # an operation that answers with a plain value
        code = m.Output_Result_Result_get(record)
        if code != m.Success:
            raise ApplicationError(code, m.SafeString_Value(m.Output_Result_ResultString_get(record)))
        kind = type(record).__name__
        values = [_plain(getattr(m, f"{kind}_{field}_get")(record)) for field in self._outputs(operation, kind)]
        return values[0] if len(values) == 1 else tuple(values) if values else None

    def _outputs(self, operation, kind):
        """The record's fields in the order the command declares its outputs."""
        if operation not in _OUTPUTS:
            info = self.record("GetCommandInfo", operation)
            text = m.Output_GetCommandInfo_DefaultOutputString(info).split("Output Parameters", 1)[1]
            declared = [line.split()[0] for line in text.splitlines()[2:] if line.strip() and line != "None"]
            _OUTPUTS[operation] = [f for f in declared if hasattr(m, f"{kind}_{f}_get")]
        return _OUTPUTS[operation]

    def refusal(self, operation, *args):
        record = self.record(operation, *args)
        return m.Output_Result_Result_get(record), m.SafeString_Value(m.Output_Result_ResultString_get(record))

    def __getattr__(self, operation):
        return lambda *args: self._run(operation, *args)

    def close(self):
        m.delete_ZarvoPelluxPostClient(self.proxy)
