"""Script classes over the `_Client3` extension module.

Every class is built at import from the module's own function table: a function `X_swigregister`
makes a class X, `new_X` and `X_swiginit` its constructor, `delete_X` its destructor, each pair
`X_F_get` / `X_F_set` a property F, and every other `X_member` function a method. A function added
to the table therefore shows up here without a change to this file.

    import Client3

    with Client3.connect("127.0.0.1", 8870) as client:
        names = client.GetSubjectNames().check()
        print([str(name) for name in names.Names])

Operations answer with records; a failure inside the application is reported in the record's
`Result` and `ResultString`, never raised. `record.ok` tells success, and `record.check()` raises
`Client3.Error` for scripts that prefer exceptions.

The numeric vectors are buffers for NumPy without a copy (`numpy.asarray(v)`, `v.view()`,
`vectord.from_buffer(array)`, `record.arrays()` of a trajectory), through the package's second
extension module `Client3._buffers`. While a view of a vector is exported, operations that could
move its storage raise BufferError. NumPy itself is imported only when an array is asked for.
"""
from __future__ import annotations

import collections.abc
import itertools
import pkgutil
from typing import Any, Callable, Dict, Iterator, List, NamedTuple, Optional, Tuple

import _Client3

# The package's own extension modules are installed beside this file; with a source tree first on the
# path, the installed ones are found all the same.
__path__ = pkgutil.extend_path(__path__, __name__)
from Client3 import _buffers  # noqa: E402

_REGISTER, _INIT, _NEW, _DELETE = "_swigregister", "_swiginit", "new_", "delete_"

_functions: Dict[str, Callable[..., Any]] = {
    name: value for name, value in vars(_Client3).items() if callable(value) and not name.startswith("__")
}

# The result codes, as the module defines them.
Success: int = _Client3.Success
UnknownStatus: int = _Client3.UnknownStatus
NotConnected: int = _Client3.NotConnected
RequestTimedOut: int = _Client3.RequestTimedOut
ReplyParsingError: int = _Client3.ReplyParsingError
ApplicationError: int = _Client3.ApplicationError
InvalidFrameNumber: int = _Client3.InvalidFrameNumber
ConversionError: int = _Client3.ConversionError
ExpectedOneFrame: int = _Client3.ExpectedOneFrame
ToString: Callable[[int], str] = _Client3.ToString


class Members(NamedTuple):
    """What the function table gives one class: its fields (getter and setter pairs) and its
    methods, each in table order, and whether it can be constructed and destroyed."""

    fields: Tuple[str, ...]
    methods: Tuple[str, ...]
    constructible: bool
    destructible: bool


def _table() -> Dict[str, Members]:
    classes = [name[: -len(_REGISTER)] for name in _functions if name.endswith(_REGISTER)]
    # Longest names first, so that a member of Output_GetStringList never goes to Output_GetString.
    by_length = sorted(classes, key=len, reverse=True)
    found: Dict[str, Tuple[List[str], List[str]]] = {name: ([], []) for name in classes}
    for function in _functions:
        owner = next((c for c in by_length if function.startswith(c + "_")), None)
        if owner is None:
            continue
        member = function[len(owner) + 1 :]
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


TABLE: Dict[str, Members] = _table()
"""Every registered class of the module with the members the function table gives it."""

VECTORS = tuple(name for name in TABLE if name.startswith("vector"))
RECORD_BASE = "Output_Result"


def base_of(name: str) -> Optional[str]:
    """Every Output_* record derives from Output_Result."""
    return RECORD_BASE if name.startswith("Output_") and name != RECORD_BASE else None


class Error(Exception):
    """An operation that did not succeed: the record's result code and its text."""

    def __init__(self, code: int, text: str) -> None:
        super().__init__(code, text)
        self.code = code
        self.text = text

    def __str__(self) -> str:
        return f"{self.text} (result code {self.code})"


class _Proxy:
    """Common to every class: construction through new_ and _swiginit."""

    _name = ""

    def __init__(self, *args: Any) -> None:
        new = _functions.get(_NEW + self._name)
        if new is None:
            raise TypeError(f"{self._name} objects come only from the module; they cannot be made by scripts")
        _functions[self._name + _INIT](self, new(*args))


class _Record(_Proxy):
    """A record: its fields are properties, shown by repr."""

    _fields: Tuple[str, ...] = ()

    def __repr__(self) -> str:
        shown = ", ".join(f"{field}={_show(getattr(self, field))}" for field in self._fields)
        return f"{type(self).__name__}({shown})"


def _show(value: Any) -> str:
    return repr(str(value)) if isinstance(value, _Text) else repr(value)


class _Result(_Record):
    """Output_Result and every record derived from it."""

    @property
    def ok(self) -> bool:
        """True when Result is Success."""
        return bool(self.Result == Success)  # type: ignore[attr-defined]

    def check(self) -> Any:
        """Returns the record when it succeeded; raises Client3.Error with its code and text otherwise."""
        if not self.ok:
            raise Error(self.Result, str(self.ResultString))  # type: ignore[attr-defined]
        return self


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

    def __iter__(self) -> Any:
        return self


class _Client(_Proxy):
    """The client: a context manager that disconnects on exit."""

    def __enter__(self) -> Any:
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

    def __iter__(self) -> Iterator[Any]:
        return _functions[self._name + "_iterator"](self)  # type: ignore[no-any-return]

    def __reversed__(self) -> Iterator[Any]:
        position = _functions[self._name + "_rbegin"](self)
        for _ in range(len(self)):  # the reverse iterator has no end of its own
            yield position.next()

    def insert(self, index: int, value: Any) -> None:
        self[index:index] = [value]

    def extend(self, values: Any) -> None:
        if values is self:
            values = list(values)
        self[len(self) :] = list(values)

    def pop(self, index: int = -1) -> Any:
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

    def fill(self, buffer: Any) -> None:
        """Replaces the contents from a C-contiguous buffer of matching numbers in one copy; see
        Client3._buffers.fill for the rules. Unchanged on failure."""
        _buffers.fill(self, buffer)

    @classmethod
    def from_buffer(cls, buffer: Any) -> Any:
        """A new vector holding the elements of a buffer (a NumPy array, array.array, bytes)."""
        vector = cls()
        _buffers.fill(vector, buffer)
        return vector

    def __array__(self, dtype: Any = None, copy: Optional[bool] = None) -> Any:
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


def _kind(name: str) -> type:
    if name in VECTORS:
        return _Vector
    if name == "SafeString":
        return _Text
    if name == "SwigPyIterator":
        return _Iterator
    if name == "ZarvoPelluxPostClient":
        return _Client
    if name == RECORD_BASE:
        return _Result
    if name == "Type_Parameter":
        return _Record
    return _Proxy


def _emptying(clear: Callable[..., Any]) -> Callable[[Any], None]:
    """The vectors have no delete_ function: a vector that a proxy owns is emptied when the proxy
    goes, which frees its elements; the vector object itself stays allocated."""

    def destroy(proxy: Any) -> None:
        clear(proxy)

    return destroy


def _method(function: Callable[..., Any], name: str) -> Callable[..., Any]:
    def method(self: Any, *args: Any) -> Any:
        return function(self, *args)

    method.__name__ = name
    return method


def _resizing(function: Callable[..., Any], name: str) -> Callable[..., Any]:
    guard = _buffers.guard
    if name == "swap":

        def method(self: Any, *args: Any) -> Any:
            guard(self, *args)
            return function(self, *args)

    elif name == "__setitem__":

        def method(self: Any, *args: Any) -> Any:
            # A slice given a sequence of its own length is written in place; anything else may move.
            if args and isinstance(args[0], slice) and _buffers.exporting():
                value = args[1] if len(args) > 1 else ()
                if not hasattr(value, "__len__") or len(value) != len(range(*args[0].indices(len(self)))):
                    guard(self)
            return function(self, *args)

    else:

        def method(self: Any, *args: Any) -> Any:
            guard(self)
            return function(self, *args)

    method.__name__ = name
    return method


def _trajectory_arrays(self: Any) -> Tuple[Any, Any, Any, Any]:
    """The four fields as NumPy arrays in one call: X, Y and Z are float64 arrays over the record's
    own storage (no copy; they keep the record alive), E a bool array (a copy: its bits are packed)."""
    import numpy

    return numpy.asarray(self.X), numpy.asarray(self.Y), numpy.asarray(self.Z), numpy.asarray(self.E)


# Members of single classes that the function table does not give.
_EXTRAS: Dict[str, Dict[str, Any]] = {"Output_GetTrajectory": {"arrays": _trajectory_arrays}}


class ParameterVector:
    """A record's parameter list. It has no operations of its own: it is passed back to
    ProcessRequest, which reads it through `this`; it keeps its record alive while it is held."""

    def __init__(self, proxy: Any, record: Any) -> None:
        self.this = proxy
        self._record = record


def _field(getter: Callable[..., Any], setter: Callable[..., Any], name: str) -> property:
    exporting = _buffers.exporting

    def get(self: Any) -> Any:
        value = getter(self)
        # A text or vector field points into the record: keep the record while it is in use.
        if hasattr(value, "__dict__"):
            if not value.this.own():
                value.__dict__.setdefault("_record", self)
        elif value is not None and not isinstance(value, (int, float, bool)):
            value = ParameterVector(value, self)
        return value

    def put(self: Any, value: Any) -> None:
        # Assigning a vector field may move its storage: refused while a view of it is exported.
        if exporting():
            _buffers.guard(getter(self))
        setter(self, value)

    return property(get, put, doc=f"The record's {name} field.")


def _make(name: str, members: Members, classes: Dict[str, type]) -> type:
    kind = _kind(name)
    base = base_of(name)
    bases: Tuple[type, ...] = (classes[base],) if base else (kind,)
    namespace: Dict[str, Any] = {"_name": name, "__module__": __name__}
    for method in members.methods:
        if method not in vars(kind):
            wrap = _resizing if name in VECTORS and (method in _RESIZING or method == "__setitem__") else _method
            namespace[method] = wrap(_functions[f"{name}_{method}"], method)
    namespace.update(_EXTRAS.get(name, {}))
    for field in members.fields:
        namespace[field] = _field(_functions[f"{name}_{field}_get"], _functions[f"{name}_{field}_set"], field)
    inherited = getattr(bases[0], "_fields", ())
    namespace["_fields"] = tuple(inherited) + members.fields
    if members.destructible:
        namespace["__swig_destroy__"] = _functions[_DELETE + name]
    elif name in VECTORS:
        namespace["__swig_destroy__"] = _emptying(_functions[name + "_clear"])
    return type(bases[0])(name, bases, namespace)


def _build() -> Dict[str, type]:
    classes: Dict[str, type] = {}
    for name in sorted(TABLE, key=lambda n: base_of(n) is not None):  # bases first
        classes[name] = _make(name, TABLE[name], classes)
    return classes


classes: Dict[str, type] = _build()
"""The class of every registered type, by name."""


def register() -> None:
    """Gives every native type its class here, so that proxies the module hands out are instances
    of these classes. Done once at import; call it again only after something else registered
    classes of its own."""
    for name, cls in classes.items():
        _functions[name + _REGISTER](cls)


register()
globals().update(classes)

SafeString = classes["SafeString"]
ZarvoPelluxPostClient = classes["ZarvoPelluxPostClient"]
Client = ZarvoPelluxPostClient


def connect(host: str = "127.0.0.1", port: int = 0) -> Any:
    """A client connected to the application at host and port (0 means the default port, 8870);
    raises Client3.Error with the result code and text when connecting fails. `host` may carry
    options: "127.0.0.1?timeout=2000&connect=500&token=SECRET"."""
    client = Client()
    client.Connect(host, port).check()
    return client
