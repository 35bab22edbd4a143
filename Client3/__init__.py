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
"""
from __future__ import annotations

import collections.abc
import itertools
from typing import Any, Callable, Dict, Iterator, List, NamedTuple, Optional, Tuple

import _Client3

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


class ParameterVector:
    """A record's parameter list. It has no operations of its own: it is passed back to
    ProcessRequest, which reads it through `this`; it keeps its record alive while it is held."""

    def __init__(self, proxy: Any, record: Any) -> None:
        self.this = proxy
        self._record = record


def _field(getter: Callable[..., Any], setter: Callable[..., Any], name: str) -> property:
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
        setter(self, value)

    return property(get, put, doc=f"The record's {name} field.")


def _make(name: str, members: Members, classes: Dict[str, type]) -> type:
    kind = _kind(name)
    base = base_of(name)
    bases: Tuple[type, ...] = (classes[base],) if base else (kind,)
    namespace: Dict[str, Any] = {"_name": name, "__module__": __name__}
    for method in members.methods:
        if method not in vars(kind):
            namespace[method] = _method(_functions[f"{name}_{method}"], method)
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
    options: "127.0.0.1?timeout=2000&connect=500"."""
    client = Client()
    client.Connect(host, port).check()
    return client
