"""Client3: Python scripts that drive a running Pellux Post application.

The client
    Start the application (`client3-host`, or `python -m Client3.host`), then connect:

        import Client3

        with Client3.connect("127.0.0.1", 8870) as client:
            names = client.GetMarkerNames("Alice").check()
            print(names.Names)                        # ['LANK', 'LKNE', ...]
            trajectory = client.GetTrajectory(subject="Alice", marker="LANK").check()
            client.OfflineFixOcclusion("Alice", "").check()

    Every method of the client (Client3.Client) is one command of the application: its parameters
    are the command's inputs named in snake_case (Subject -> subject, SelectedOnly -> selected_only),
    given by position or by keyword; help(Client3.Client.GetTrajectory) describes one.

    A method answers with a record. A failure inside the application does not raise: the record's
    `Result` holds the code and `ResultString` the reason, `record.ok` (and `bool(record)`) says
    whether it succeeded, and `record.check()` returns the record or raises Client3.Error (`code`,
    `text`, `command`). `Client3.connect(..., raise_errors=True)` gives a client whose every failed
    operation raises Client3.Error. An argument of the wrong type raises as the module does, with a
    note that names the method, the parameter and the type of the value given.

Records
    Fields are attributes: numbers as int, float and bool, text as str, lists of text as list[str],
    numbers of a whole take as vectors (below). The settings records (OfflineGet...Settings) are
    changed field by field and given back to their OfflineSet...Settings method. Each record's
    help lists its fields with their types.

Vectors
    vectord, vectorf, vectori, vectorull, vectorb and vectorss are mutable sequences. The numeric
    ones are buffers for NumPy without a copy (numpy.asarray(v), v.view(), record.arrays() of a
    trajectory, vectord.from_buffer(array)); while a view of a vector is exported, whatever could
    move its storage raises BufferError. Elements of a vectorss read as str.

Batch
    Client3.batch runs one job over many takes on a process pool or a Dask cluster; see
    help(Client3.batch) and `python -m Client3.batch --help`. Client3.testing starts applications
    for tests, and `python -m Client3 --version` prints the version.

The flat extension module `_Client3` underneath keeps its documented behaviour: the classes here are
built at import from its function table.
"""
from __future__ import annotations

import collections
import collections.abc
import itertools
import keyword
import os
import sys

import _Client3

# The package's own extension modules are installed beside this file; with a source tree first on the
# path, the installed ones are found all the same.
__path__ = list(__path__)
for _entry in sys.path:
    _folder = os.path.abspath(os.path.join(_entry or os.curdir, __name__))
    if _folder not in __path__ and os.path.isdir(_folder):
        __path__.append(_folder)
from Client3 import _buffers, _catalogue, _interface  # noqa: E402

# What help(Client3) documents after its guide: the classes are reached as attributes (Client3.Client,
# Client3.Output_GetTrajectory, ...), each with its own help.
__all__ = [
    "connect", "Error", "ToString", "Success", "UnknownStatus", "NotConnected", "RequestTimedOut",
    "ReplyParsingError", "ApplicationError", "InvalidFrameNumber", "ConversionError", "ExpectedOneFrame",
]

_REGISTER, _INIT, _NEW, _DELETE = "_swigregister", "_swiginit", "new_", "delete_"

_functions = {name: value for name, value in vars(_Client3).items() if callable(value) and not name.startswith("__")}

# The result codes, as the module defines them.
Success = _Client3.Success
UnknownStatus = _Client3.UnknownStatus
NotConnected = _Client3.NotConnected
RequestTimedOut = _Client3.RequestTimedOut
ReplyParsingError = _Client3.ReplyParsingError
ApplicationError = _Client3.ApplicationError
InvalidFrameNumber = _Client3.InvalidFrameNumber
ConversionError = _Client3.ConversionError
ExpectedOneFrame = _Client3.ExpectedOneFrame
ToString = _Client3.ToString


def __getattr__(name: str) -> object:
    """__version__: read from the installed package's metadata when it is first asked for."""
    if name == "__version__":
        from importlib.metadata import version

        return version("client3")
    raise AttributeError(f"module {__name__!r} has no attribute {name!r}")


Members = collections.namedtuple("Members", "fields methods constructible destructible")
Members.__doc__ = """What the function table gives one class: its fields (getter and setter pairs) and
its methods, each in table order, and whether it can be constructed and destroyed."""


def _table() -> dict[str, Members]:
    found: dict[str, tuple[list[str], list[str]]] = {
        name[: -len(_REGISTER)]: ([], []) for name in _functions if name.endswith(_REGISTER)
    }
    for function in _functions:
        # The longest class name before one of its underscores: a member of Output_GetStringList never
        # goes to Output_GetString.
        cut = function.rfind("_")
        while cut > 0 and function[:cut] not in found:
            cut = function.rfind("_", 0, cut)
        if cut <= 0:
            continue
        owner, member = function[:cut], function[cut + 1 :]
        fields, methods = found[owner]
        if member in (_REGISTER[1:], _INIT[1:]):
            continue
        if member.endswith("_get") and f"{owner}_{member[:-4]}_set" in _functions:
            fields.append(member[:-4])
        elif member.endswith("_set") and f"{owner}_{member[:-4]}_get" in _functions:
            continue
        else:
            methods.append(member)
    return {
        name: Members(tuple(fields), tuple(methods), _NEW + name in _functions, _DELETE + name in _functions)
        for name, (fields, methods) in found.items()
    }


TABLE = _table()
"""Every registered class of the module with the members the function table gives it."""

VECTORS = tuple(name for name in TABLE if name.startswith("vector"))
RECORD_BASE = "Output_Result"
CLIENT = "ZarvoPelluxPostClient"


def base_of(name: str) -> str | None:
    """Every Output_* record derives from Output_Result."""
    return RECORD_BASE if name.startswith("Output_") and name != RECORD_BASE else None


class Error(Exception):
    """An operation that did not succeed: the result code, the application's text and the command."""

    def __init__(self, code: int, text: str, command: str | None = None) -> None:
        super().__init__(code, text, command)
        self.code = code
        self.text = text
        self.command = command

    def __str__(self) -> str:
        said = f"{self.text} (result code {self.code})"
        return f"{self.command}: {said}" if self.command else said


class _Proxy:
    """Common to every class: construction through new_ and _swiginit."""

    _name = ""

    def __init__(self, *args: object) -> None:
        new = _functions.get(_NEW + self._name)
        if new is None:
            raise TypeError(f"{self._name} objects come only from the module; they cannot be made by scripts")
        _functions[self._name + _INIT](self, new(*args))


class _Record(_Proxy):
    """A record: its fields are properties, shown by repr."""

    _fields: tuple[str, ...] = ()

    def __repr__(self) -> str:
        shown = ", ".join(f"{field}={_show(getattr(self, field))}" for field in self._fields)
        return f"{type(self).__name__}({shown})"


def _show(value: object) -> str:
    return repr(str(value)) if isinstance(value, _Text) else repr(value)


_result_failed = _Client3.Output_Result_Error


class _Result(_Record):
    """Output_Result and every record derived from it."""

    @property
    def ok(self) -> bool:
        """True when Result is Success."""
        return not _result_failed(self)

    def __bool__(self) -> bool:
        """A record is true when its operation succeeded, as `ok` says."""
        return not _result_failed(self)

    def check(self) -> object:
        """Returns the record when it succeeded; raises Client3.Error with its code and text otherwise."""
        if _result_failed(self):
            raise Error(self.Result, self.ResultString)  # type: ignore[attr-defined]
        return self


_text_value = _Client3.SafeString_Value


class _Text(_Proxy):
    """SafeString: str() gives its text; it compares equal to the same text."""

    def __eq__(self, other: object) -> bool:
        if isinstance(other, (str, _Text)):
            return str(self) == str(other)
        return NotImplemented

    def __ne__(self, other: object) -> bool:
        equal = self.__eq__(other)
        return equal if equal is NotImplemented else not equal

    def __hash__(self) -> int:
        return hash(str(self))


class _Iterator(_Proxy):
    """The module's iterator objects, usable in for loops."""

    def __iter__(self) -> _Iterator:
        return self


class _Client(_Proxy):
    """The client: a context manager that disconnects on exit."""

    def __enter__(self) -> _Client:
        return self

    def __exit__(self, *exc: object) -> None:
        self.Disconnect()  # type: ignore[attr-defined]


_REPR_LIMIT = 30

# The vectors whose elements lie side by side in memory, with the format of their views.
VIEWABLE = {"vectord": "d", "vectorf": "f", "vectori": "i", "vectorull": "Q"}

# Operations of the module's vectors that may move their storage: refused while a view of the
# vector is exported (swap checks both vectors). Slice assignment is checked in __setitem__.
_RESIZING = frozenset(
    {"append", "push_back", "pop", "pop_back", "resize", "reserve", "clear", "erase", "assign", "swap",
     "__setslice__", "__delslice__", "__delitem__"}
)


class _Vector(_Proxy, collections.abc.MutableSequence):  # type: ignore[type-arg]
    """The vectors as mutable sequences. Indexing, slices, len, append and clear are the module's
    own functions; iteration goes through its iterators."""

    def __iter__(self) -> collections.abc.Iterator[object]:
        return _functions[self._name + "_iterator"](self)  # type: ignore[no-any-return]

    def __reversed__(self) -> collections.abc.Iterator[object]:
        position = _functions[self._name + "_rbegin"](self)
        for _ in range(len(self)):  # the reverse iterator has no end of its own
            yield position.next()

    def insert(self, index: int, value: object) -> None:
        self[index:index] = [value]

    def extend(self, values: collections.abc.Iterable[object]) -> None:
        if values is self:
            values = list(values)
        self[len(self) :] = list(values)

    def pop(self, index: int = -1) -> object:
        _buffers.guard(self)
        if index == -1:
            return _functions[self._name + "_pop"](self)
        self[index]  # IndexError when there is no such element
        position = index % len(self)
        piece = self[position : position + 1]  # a copy: an element read by index points into the vector
        del self[position]
        return piece.pop()

    def reverse(self) -> None:
        self[:] = self[::-1]

    def __eq__(self, other: object) -> bool:
        if isinstance(other, (_Vector, list)):
            return len(self) == len(other) and all(a == b for a, b in zip(self, other))
        return NotImplemented

    def __ne__(self, other: object) -> bool:
        equal = self.__eq__(other)
        return equal if equal is NotImplemented else not equal

    __hash__ = None  # type: ignore[assignment]

    def view(self) -> memoryview:
        """A read-write memoryview over the elements, without a copy (vectord, vectorf, vectori and
        vectorull; formats d, f, i, Q). It keeps this vector, and the record it belongs to, alive."""
        return _buffers.view(self)  # type: ignore[no-any-return]

    def fill(self, buffer: object) -> None:
        """Replaces the contents from a C-contiguous buffer of matching numbers in one copy; see
        Client3._buffers.fill for the rules. Unchanged on failure."""
        _buffers.fill(self, buffer)

    @classmethod
    def from_buffer(cls, buffer: object) -> _Vector:
        """A new vector holding the elements of a buffer (a NumPy array, array.array, bytes)."""
        vector = cls()
        _buffers.fill(vector, buffer)
        return vector

    def __array__(self, dtype: object = None, copy: bool | None = None) -> object:
        """numpy.asarray(v): the vector's own storage for the numeric vectors, a copy for vectorb
        (its bits are packed) and vectorss (texts)."""
        import numpy

        if self._name in VIEWABLE:
            array = numpy.asarray(_buffers.view(self))
        elif copy is False:
            raise ValueError(f"a {self._name} has no contiguous storage: it becomes an array only as a copy")
        else:
            values = _buffers.copy(self)
            array = numpy.asarray(values, dtype=str) if isinstance(values, list) else numpy.asarray(values)
            copy = False
        if dtype is not None and array.dtype != numpy.dtype(dtype):
            if copy is False:
                raise ValueError(f"a {self._name} becomes an array of {dtype} only as a copy")
            return array.astype(dtype)
        return array.copy() if copy else array

    def __repr__(self) -> str:
        shown = [_show(value) for value in itertools.islice(self, _REPR_LIMIT)]
        if len(self) > _REPR_LIMIT:
            shown.append(f"... ({len(self)} elements)")
        return f"{type(self).__name__}([{', '.join(shown)}])"


class _Texts(_Vector):
    """vectorss: its elements read as str (decoded from UTF-8 as the module decodes text)."""

    def __getitem__(self, index: int | slice) -> object:
        value = _vectorss_getitem(self, index)
        return value if isinstance(index, slice) else _text_value(value)

    def __iter__(self) -> collections.abc.Iterator[str]:
        return iter(_buffers.copy(self))  # type: ignore[no-any-return]

    def __reversed__(self) -> collections.abc.Iterator[str]:
        return reversed(_buffers.copy(self))  # type: ignore[no-any-return]

    def pop(self, index: int = -1) -> str:
        value = _Vector.pop(self, index)
        return value if isinstance(value, str) else _text_value(value)  # type: ignore[no-any-return]

    def front(self) -> str:
        return _text_value(_Client3.vectorss_front(self))  # type: ignore[no-any-return]

    def back(self) -> str:
        return _text_value(_Client3.vectorss_back(self))  # type: ignore[no-any-return]


_vectorss_getitem = _Client3.vectorss___getitem__

# The vector members that scripts call with fixed arguments: given real parameters, so that they take
# keywords as the sequence protocol names them.
_VECTOR_SIGNATURES = {
    "__getitem__": ("index",), "__setitem__": ("index", "value"), "__delitem__": ("index",), "__len__": (),
    "append": ("value",), "clear": (),
}


def _parameters(name: str, method: str) -> tuple[str, ...] | None:
    """The parameters of a member that scripts call with fixed arguments; None for the module's
    overloaded members, which take what their forms take."""
    if name in VECTORS:
        return _VECTOR_SIGNATURES.get(method)
    if name == "SafeString" or name.startswith("Output_") or method == "__next__":
        return ()
    return None


def _kind(name: str) -> type:
    if name == "vectorss":
        return _Texts
    if name in VECTORS:
        return _Vector
    if name == "SafeString":
        return _Text
    if name == "SwigPyIterator":
        return _Iterator
    if name == CLIENT:
        return _Client
    if name == RECORD_BASE:
        return _Result
    if name == "Type_Parameter":
        return _Record
    return _Proxy


def _emptying(clear: collections.abc.Callable[..., object]) -> collections.abc.Callable[[object], None]:
    """The vectors have no delete_ function: a vector that a proxy owns is emptied when the proxy
    goes, which frees its elements; the vector object itself stays allocated."""

    def destroy(self: object) -> None:
        clear(self)

    return destroy


def _method(function: collections.abc.Callable[..., object], name: str) -> collections.abc.Callable[..., object]:
    def method(self: object, *args: object) -> object:
        return function(self, *args)

    method.__name__ = name
    return method


def _slice_assignment(function: collections.abc.Callable[..., object]) -> collections.abc.Callable[..., object]:
    guard, exporting = _buffers.guard, _buffers.exporting

    def __setitem__(self: collections.abc.Sized, index: object, value: object) -> object:
        # A slice given a sequence of its own length is written in place; anything else may move.
        if isinstance(index, slice) and exporting():
            if not hasattr(value, "__len__") or len(value) != len(range(*index.indices(len(self)))):  # type: ignore[arg-type]
                guard(self)
        return function(self, index, value)

    return __setitem__


def _resizing(function: collections.abc.Callable[..., object], name: str) -> collections.abc.Callable[..., object]:
    guard = _buffers.guard
    if name == "swap":

        def method(self: object, *args: object) -> object:
            guard(self, *args)
            return function(self, *args)

    else:

        def method(self: object, *args: object) -> object:
            guard(self)
            return function(self, *args)

    method.__name__ = name
    return method


def _trajectory_arrays(self: object) -> tuple[object, object, object, object]:
    """The four fields as NumPy arrays in one call: X, Y and Z are float64 arrays over the record's
    own storage (no copy; they keep the record alive), E a bool array (a copy: its bits are packed)."""
    import numpy

    return numpy.asarray(self.X), numpy.asarray(self.Y), numpy.asarray(self.Z), numpy.asarray(self.E)  # type: ignore[attr-defined]


# Members of single classes that the function table does not give.
_EXTRAS = {"Output_GetTrajectory": {"arrays": _trajectory_arrays}}


class ParameterVector:
    """A record's parameter list. It has no operations of its own: it is passed back to
    ProcessRequest, which reads it through `this`; it keeps its record alive while it is held."""

    def __init__(self, proxy: object, record: object) -> None:
        self.this = proxy
        self._record = record


_alloc_text = _Client3.ZarvoPelluxPostClient_AllocSafeString


def _field(getter: collections.abc.Callable[..., object], setter: collections.abc.Callable[..., object],
           name: str, kind: str) -> property:
    exporting = _buffers.exporting

    def get(self: object) -> object:
        value = getter(self)
        if isinstance(value, _Text):  # text reads as str, a list of texts as a list of str
            return _text_value(value)
        if isinstance(value, _Texts):
            return _buffers.copy(value)
        # A vector field points into the record: keep the record while it is in use.
        if hasattr(value, "__dict__"):
            if not value.this.own():  # type: ignore[attr-defined]
                value.__dict__.setdefault("_record", self)
        elif value is not None and not isinstance(value, (int, float, bool)):
            value = ParameterVector(value, self)
        return value

    def put(self: object, value: object) -> None:
        current = getter(self)
        # Assigning a vector field may move its storage: refused while a view of it is exported.
        if exporting():
            _buffers.guard(current)
        if isinstance(current, _Text) and isinstance(value, (str, bytes)):
            value = _alloc_text(None, value)  # an owned copy, freed when the field has copied it
        elif isinstance(current, _Vector) and not isinstance(value, _Proxy):
            value = type(current)(value)
        setter(self, value)

    return property(get, put, doc=f"{name}: {kind}" if kind else f"The record's {name} field.")


# The operations that answer with each record.
_ANSWERED = {}  # type: dict[str, list[str]]
for _command, _answer in _interface.ANSWERS.items():
    _ANSWERED.setdefault(_answer, []).append(_command)


def _record_doc(name: str, fields: tuple[tuple[str, str], ...]) -> str:
    answered = _ANSWERED.get(name, ())
    listed = ", ".join(f"{field} ({kind})" for field, kind in fields)
    head = f"The answer of {', '.join(answered)}." if answered else "A record of the client library."
    if name == RECORD_BASE:
        head = "The answer of every operation that answers with nothing more, and the base of every record."
    elif name.endswith("Settings"):
        head += f" Changed field by field, it is given back to {name.replace('Output_', 'OfflineSet')}."
    return _wrap(f"{head} Fields: {listed}." if fields else head)


def _wrap(text: str, width: int = 96) -> str:
    """Lines of at most `width` characters, broken at the last space that allows it."""
    lines = []
    while len(text) > width:
        cut = text.rfind(" ", 0, width + 1)
        if cut <= 0:
            break
        lines.append(text[:cut])
        text = text[cut + 1 :]
    lines.append(text)
    return "\n".join(lines)


def _own(kind: type, member: str) -> bool:
    """Whether one of this module's classes that `kind` derives from defines `member` itself."""
    return any(member in vars(cls) for cls in kind.__mro__ if cls.__module__ == __name__)


def _make(name: str, members: Members, classes: dict[str, type]) -> type:
    kind = _kind(name)
    base = base_of(name)
    bases: tuple[type, ...] = (classes[base],) if base else (kind,)
    namespace: dict[str, object] = {"_name": name, "__module__": __name__}
    declared = dict(_interface.FIELDS.get(name, ()))
    if name in _interface.FIELDS:
        namespace["__doc__"] = _record_doc(name, _interface.FIELDS[name])
    for method in () if name == CLIENT else members.methods:
        if _own(kind, method):
            continue
        function = _functions[f"{name}_{method}"]
        parameters = _parameters(name, method)
        if name in VECTORS and method == "__setitem__":
            namespace[method] = _slice_assignment(function)
        elif parameters is not None:
            namespace[method] = _operation(function, method, parameters, name, guard=name in VECTORS and method in _RESIZING)
        elif name in VECTORS and method in _RESIZING:
            namespace[method] = _resizing(function, method)
        else:
            namespace[method] = _method(function, method)
    if name == CLIENT:
        namespace.update(_client_methods(CLIENT))
    namespace.update(_EXTRAS.get(name, {}))
    for field in members.fields:
        getter, setter = _functions[f"{name}_{field}_get"], _functions[f"{name}_{field}_set"]
        namespace[field] = _field(getter, setter, field, declared.get(field, ""))
    inherited = getattr(bases[0], "_fields", ())
    namespace["_fields"] = tuple(inherited) + members.fields
    if members.destructible:
        namespace["__swig_destroy__"] = _functions[_DELETE + name]
    elif name in VECTORS:
        namespace["__swig_destroy__"] = _emptying(_functions[name + "_clear"])
    return type(bases[0])(name, bases, namespace)


# ---- Client methods ------------------------------------------------------------------------------
#
# Each method of the client is a real function whose parameters carry the names of its command's
# inputs, so that help(), inspect.signature, keywords and editors see them. The templates, one per
# number of parameters, are compiled together once; each method is a template's code with its own
# names, calling its module function through a closure.

# Arguments the module refuses with one of these get a note naming the method and the parameter.
_REFUSED = (TypeError, ValueError, OverflowError)

# The commands whose `Path` input names a file or folder: it also accepts any os.PathLike.
_PATH_COMMANDS = frozenset({"LoadFile", "ImportFile", "SaveFile", "ExportFile", "AddScriptPath", "RemoveScriptPath",
                            "DatabaseCreate", "DatabaseSetCurrent"})

# The operations of the library that are not commands of the application, with their parameters.
_LIBRARY_OPERATIONS = {
    "Connect": (("Address", "String"), ("Port", "Int")),
    "Disconnect": (),
    "IsConnected": (),
    "AllocSafeString": (("Text", "String"),),
}

_KINDS = {"String": "str", "Int": "int", "UInt": "int", "ULong": "int", "Bool": "bool", "Float": "float",
          "Double": "float", "Strings": "list of str", "Bools": "bools", "Floats": "floats", "Doubles": "floats",
          "Ints": "ints", "ULongs": "ints", "Params": "parameter list", "Path": "str, bytes or os.PathLike"}


def snake_case(name: str) -> str:
    """A catalogue name in Python's spelling: SelectedOnly -> selected_only, IDList -> id_list."""
    out = []
    for index, letter in enumerate(name):
        if letter.isupper() and index and (name[index - 1].islower() or name[index - 1].isdigit() or (
                index + 1 < len(name) and name[index + 1].islower() and name[index - 1].isupper())):
            out.append("_")
        out.append(letter.lower())
    spelled = "".join(out)
    return spelled + "_" if keyword.iskeyword(spelled) else spelled


class _Operation:
    """What a method knows of itself: its command, its parameters and their wire types."""

    __slots__ = ("command", "qualname", "parameters", "kinds")

    def __init__(self, command: str, qualname: str, parameters: tuple[str, ...], kinds: tuple[str, ...]) -> None:
        self.command = command
        self.qualname = qualname
        self.parameters = parameters
        self.kinds = kinds

    def refused(self, error: BaseException, values: tuple[object, ...]) -> str:
        """The note for an argument the module refused: the method, the parameter, the value's type."""
        text = str(error)
        index = None
        at = text.find("argument ")
        if text.startswith("in method ") and at >= 0:
            number = text[at + 9 :].split(" ", 1)[0]
            if number.isdigit() and 0 <= int(number) - 2 < len(values):  # the client is argument 1
                index = int(number) - 2
        if index is None:
            index = next((i for i, kind in enumerate(self.kinds) if kind in ("String", "Path")
                          and not isinstance(values[i], (str, bytes))), None)
        called = f"{self.qualname}({', '.join(self.parameters)})"
        if index is None:
            given = ", ".join(f"{p}: {type(v).__name__}" for p, v in zip(self.parameters, values))
            return f"{called} was given {given}"
        import reprlib

        value = values[index]
        return f"{called}: parameter '{self.parameters[index]}' was given {type(value).__name__} {reprlib.repr(value)}"


def _note(error: BaseException, operation: _Operation, values: tuple[object, ...]) -> BaseException | None:
    """Adds the note to the refused argument's exception (None: raise it again), or, where exceptions
    have no notes, gives an exception of the same type whose message ends with it."""
    note = operation.refused(error, values)
    if hasattr(error, "add_note"):
        error.add_note(note)
        return None
    try:
        return type(error)(f"{error}\n{note}")
    except Exception:  # a type that takes other arguments is raised as it was
        return None


def _failure(client: object, operation: _Operation, result: object) -> Error | None:
    """For a client that raises: the Error of a failed operation, or None when it succeeded."""
    if isinstance(result, _Result):
        if not _result_failed(result):
            return None
        return Error(result.Result, result.ResultString, operation.command)  # type: ignore[attr-defined]
    # SetSceneName answers False when the command did not succeed, and GetFrameCount 0 (which a
    # connected client may also be answered for an empty take).
    if operation.command not in _PLAIN_ANSWERS or result not in (False, 0):
        return None
    connected = Client.IsConnected(client)
    if connected and operation.command == "GetFrameCount":
        return None
    code = ApplicationError if connected else NotConnected
    return Error(code, ToString(code), operation.command)


def _path(value: object) -> object:
    return value if isinstance(value, (str, bytes)) or not isinstance(value, os.PathLike) else os.fspath(value)


_TEMPLATE = """
def make_{arity}_{checked}(call, operation):
    def method(self{parameters}):
        try:
            {answer}call(self{parameters})
        except REFUSED as _error:
            _chained = note(_error, operation, ({values}))
            if _chained is None:
                raise
            raise _chained from _error
{tail}    return method
"""
# Without parameters there is no argument to refuse.
_WITHOUT_PARAMETERS = """
def make_0_{checked}(call, operation):
    def method(self):
        {answer}call(self)
{tail}    return method
"""
_CHECKED = """        _failed = failure(self, operation, _result)
        if _failed is not None:
            raise _failed
        return _result
"""


def _templates(most: int) -> dict[str, collections.abc.Callable[..., object]]:
    """The templates of methods of up to `most` parameters, compiled together: make_N_False(call,
    operation) gives a method of N parameters, make_N_True one that raises when it fails."""
    sources = []
    for arity in range(most + 1):
        names = [f"a{index}" for index in range(arity)]
        for checked in (False, True):
            sources.append((_TEMPLATE if arity else _WITHOUT_PARAMETERS).format(
                arity=arity, checked=checked, parameters="".join(f", {name}" for name in names),
                answer="_result = " if checked else "return ", values="".join(f"{name}, " for name in names),
                tail=_CHECKED if checked else ""))
    scope: dict[str, object] = {"REFUSED": _REFUSED, "note": _note, "failure": _failure}
    exec(compile("".join(sources), "<Client3 methods>", "exec"), scope)
    return scope  # type: ignore[return-value]


def _paths(call: collections.abc.Callable[..., object], positions: tuple[int, ...]) -> collections.abc.Callable[..., object]:
    """`call` with the arguments at `positions` taken as os.fspath gives them, when they are paths."""

    def converted(self: object, *args: object) -> object:
        given = list(args)
        for index in positions:
            given[index] = _path(given[index])
        return call(self, *given)

    return converted


def _operation(call: collections.abc.Callable[..., object], name: str, parameters: tuple[str, ...], owner: str,
               kinds: tuple[str, ...] = (), checked: bool = False, guard: bool = False,
               doc: str | None = None) -> collections.abc.Callable[..., object]:
    """A method `name(self, *parameters)` that calls `call`; with `guard`, one that first refuses
    while a view of the vector is exported."""
    if guard:
        guarded, check = call, _buffers.guard

        def call(self: object, *args: object) -> object:
            check(self)
            return guarded(self, *args)

    paths = tuple(index for index, kind in enumerate(kinds) if kind == "Path")
    if paths:
        call = _paths(call, paths)
    operation = _Operation(name, f"{owner}.{name}", parameters, kinds or ("",) * len(parameters))
    method = _TEMPLATES[f"make_{len(parameters)}_{checked}"](call, operation)
    code = method.__code__  # type: ignore[attr-defined]
    names = ("self", *parameters) + code.co_varnames[len(parameters) + 1 :]
    changes: dict[str, object] = {"co_varnames": names, "co_name": name}
    if sys.version_info >= (3, 11):
        changes["co_qualname"] = f"{owner}.{name}"
    method.__code__ = code.replace(**changes)  # type: ignore[attr-defined]
    method.__name__ = name
    method.__qualname__ = f"{owner}.{name}"
    method.__module__ = __name__
    method.__doc__ = doc
    return method


def _inputs(command: str) -> tuple[tuple[str, ...], tuple[str, ...]]:
    """A method's parameters and their wire types (Path for a file's path)."""
    if command in _LIBRARY_OPERATIONS:
        given = _LIBRARY_OPERATIONS[command]
    elif command.startswith("OfflineSet") and command.endswith("Settings"):
        given = (("Settings", "Settings"),)  # one settings record, not its fields
    else:
        given = _COMMANDS[command][1]
    kinds = tuple("Path" if command in _PATH_COMMANDS and name == "Path" else kind for name, kind in given)
    return tuple(snake_case(name) for name, _ in given), kinds


_COMMANDS = {name: (description, inputs, outputs) for name, description, inputs, outputs in _catalogue.COMMANDS}

# The library's own operations, and what the two that answer with a plain value answer on failure.
_LIBRARY_DOCS = {
    "Connect": "Connects to the application at `address` (a name or IP address, with options after a "
               "'?': timeout=MS, connect=MS, token=TEXT) and `port` (0: the default, 8870). Answers an "
               "Output_Result; NotConnected with the cause when no connection could be made.",
    "Disconnect": "Closes the connection; the client can connect again.",
    "IsConnected": "Whether the client is connected.",
    "AllocSafeString": "A SafeString owning a copy of `text`, made by the library.",
}
_PLAIN_ANSWERS = {"GetFrameCount": "the count, 0 when the command did not succeed",
                  "SetSceneName": "True, or False when the command did not succeed"}


def _method_doc(command: str, parameters: tuple[str, ...], kinds: tuple[str, ...]) -> str:
    if command in _LIBRARY_DOCS:
        return _wrap(_LIBRARY_DOCS[command])
    description = _COMMANDS[command][0]
    answer = _interface.ANSWERS.get(command, "")
    taken = ", ".join(f"{p} ({_KINDS.get(k, k)})" for p, k in zip(parameters, kinds))
    if kinds == ("Settings",):
        read = command.replace("OfflineSet", "OfflineGet", 1)
        taken = f"settings (the {_interface.ANSWERS.get(read, 'record')} that {read} answers, fields changed)"
    text = f"{description} Takes {taken}." if taken else description
    if command in _PLAIN_ANSWERS:
        return _wrap(f"{text} Answers {_PLAIN_ANSWERS[command]}.")
    fields = _interface.FIELDS.get(answer, ()) if answer != RECORD_BASE else ()
    given = ", ".join(f"{field} ({kind})" for field, kind in fields)
    text += f" Answers {answer}" + (f" with {given}." if given else ".")
    return _wrap(f"{text} {_failures(command)}")


# The inputs that name a time of the take: a time outside it is answered with InvalidFrameNumber.
_TIME_INPUTS = frozenset({"Frame", "Start", "End", "Ticks", "Seconds"})


def _failures(command: str) -> str:
    """The failures a command's record can report, in Result and ResultString."""
    failures = ["ApplicationError with the application's reason"]
    if any(name in _TIME_INPUTS for name, _ in _COMMANDS[command][1]):
        failures.append("InvalidFrameNumber for a time outside the take")
    if command == "GetTrajectoryAtFrame":
        failures.append("ExpectedOneFrame when the reply holds another number of frames")
    failures += ["NotConnected when there is no connection", "RequestTimedOut when no answer comes in time"]
    return f"Failures, in Result and ResultString: {', '.join(failures)}."


def _client_methods(owner: str) -> dict[str, object]:
    """The client's methods; those of the RaisingClient raise Client3.Error when they fail."""
    methods: dict[str, object] = {}
    for name in TABLE[CLIENT].methods:
        parameters, kinds = _INPUTS[name]
        methods[name] = _operation(_functions[f"{CLIENT}_{name}"], name, parameters, owner, kinds,
                                   checked=owner != CLIENT, doc=_DOCS[name])
    return methods


_INPUTS = {name: _inputs(name) for name in TABLE[CLIENT].methods}
_TEMPLATES = _templates(max(len(parameters) for parameters, _ in _INPUTS.values()))
_DOCS = {name: _method_doc(name, *_INPUTS[name]) for name in TABLE[CLIENT].methods}


def _build() -> dict[str, type]:
    classes: dict[str, type] = {}
    for name in sorted(TABLE, key=lambda n: base_of(n) is not None):  # bases first
        classes[name] = _make(name, TABLE[name], classes)
    return classes


classes = _build()
"""The class of every registered type, by name."""

# The guide ends with an index of the client's methods, by the first word of their names.
_GROUPS = {"Scene": "scene objects", "Object": "objects", "Attribute": "attributes", "Channel": "channels",
           "Parameter": "parameters", "Database": "the capture database", "Timeline": "the timeline",
           "Offline": "processing stages and their settings", "Filter": "filters"}


def _index() -> str:
    grouped: dict[str, list[str]] = {"": []}
    for name in TABLE[CLIENT].methods:
        first = next((name[:i] for i in range(1, len(name)) if name[i].isupper()), name)
        grouped.setdefault(_GROUPS.get(first, ""), []).append(name)
    grouped["connection, take, subjects, trajectories and files"] = grouped.pop("")
    lines = ["Client methods", "    By what they act on; help(Client3.Client.NAME) describes one.", ""]
    for title, names in grouped.items():
        lines.append(f"    {title[0].upper()}{title[1:]}:")
        lines += ["        " + line for line in _wrap(", ".join(names), 92).splitlines()]
    return "\n".join(lines) + "\n"


__doc__ = f"{__doc__}\n{_index()}"


def register() -> None:
    """Gives every native type its class here, so that proxies the module hands out are instances
    of these classes. Done once at import; call it again only after something else registered
    classes of its own."""
    for name, cls in classes.items():
        _functions[name + _REGISTER](cls)


register()
globals().update(classes)

SafeString = classes["SafeString"]
ZarvoPelluxPostClient = classes[CLIENT]
ZarvoPelluxPostClient.__doc__ = """The client of the application: one method per command, answering with records.

Use it through Client3.connect(address, port), in a `with` block that disconnects at its end. Each
method's parameters are its command's inputs in snake_case; a failure comes back in the record
(record.ok, record.check()), or raises Client3.Error on a client from connect(..., raise_errors=True)."""
Client = ZarvoPelluxPostClient


RaisingClient = type(ZarvoPelluxPostClient)("RaisingClient", (ZarvoPelluxPostClient,), {
    "__module__": __name__, **_client_methods("RaisingClient"),
    "__doc__": """A client whose every failed operation raises Client3.Error (code, text, command) instead
of answering with a failed record: what Client3.connect(..., raise_errors=True) gives.""",
})


def connect(host: str = "127.0.0.1", port: int = 0, *, raise_errors: bool = False) -> ZarvoPelluxPostClient:
    """A client connected to the application at host and port (0 means the default port, 8870);
    raises Client3.Error with the result code and text when connecting fails. `host` may carry
    options: "127.0.0.1?timeout=2000&connect=500&token=SECRET". With `raise_errors`, every failed
    operation of the client raises Client3.Error instead of answering with a failed record."""
    client = (RaisingClient if raise_errors else Client)()
    connected = Client.Connect(client, host, port)
    if not connected:
        raise Error(connected.Result, connected.ResultString, "Connect")
    return client
