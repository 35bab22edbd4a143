"""Writes what Client3 derives from the client library's declared interface (include/): the type stubs
Client3/__init__.pyi, and Client3/_interface.py (each record's fields with their types and what each
client operation answers, for the docs of the classes and methods), so that the stubs name exactly
the classes, methods and properties that Client3 builds at import.

    python -m Client3._generate            # rewrite them (and the stubs of Client3._buffers)
    python -m Client3._generate --check    # exit 1 when a file on disk differs

Run from the repository: the result and field types are read from include/; the parameters' names
and wire types from the command catalogue, through Client3._catalogue.
"""
from __future__ import annotations

import re
import sys
from pathlib import Path
from typing import Dict, List, Tuple

import Client3

PACKAGE = Path(__file__).resolve().parent
ROOT = PACKAGE.parent
STUBS = PACKAGE / "__init__.pyi"
INTERFACE = PACKAGE / "_interface.py"
BUFFER_STUBS = PACKAGE / "_buffers.pyi"
HEADERS = ROOT / "include" / "ZarvoSDKClientCPP"

HEAD_LINE = "# Written by Client3/_generate.py from the library's declared interface; do not edit by hand."

ELEMENTS = {"vectorb": "bool", "vectord": "float", "vectorf": "float", "vectori": "int", "vectorull": "int", "vectorss": "str"}
VECTOR_OF = {"bool": "vectorb", "double": "vectord", "float": "vectorf", "int": "vectori", "unsigned long long": "vectorull",
             "SafeString": "vectorss", "Type_Parameter": "ParameterVector"}
SCALARS = {"bool": "bool", "int": "int", "unsigned int": "int", "unsigned long long": "int", "float": "float", "double": "float",
           "ResultCode::Enum": "int", "void": "None", "std::string": "str", "SafeString": "SafeString"}
# What a script reads from a field of each C++ type, and what it may assign to it.
FIELD_READ = {"SafeString": "str", "vectorss": "list[str]"}
# The parameters' types by the catalogue's wire types.
WIRE = {"String": "_TextArgument", "Path": "_PathArgument", "Int": "int", "UInt": "int", "ULong": "int", "Bool": "bool", "Float": "float",
        "Double": "float", "Strings": "Union[vectorss, Sequence[str]]", "Bools": "Union[vectorb, Sequence[bool]]",
        "Floats": "Union[vectorf, Sequence[float]]", "Doubles": "Union[vectord, Sequence[float]]",
        "Ints": "Union[vectori, Sequence[int]]", "ULongs": "Union[vectorull, Sequence[int]]", "Params": "ParameterVector"}


def cpp_type(cpp: str) -> str:
    """A declared C++ type as the name of its Python class or type."""
    cpp = cpp.replace("const&", "").replace("&", "").strip()
    vector = re.fullmatch(r"std::vector<(.+)>", cpp)
    return VECTOR_OF[vector.group(1)] if vector else SCALARS.get(cpp, cpp)


def client_operations() -> Dict[str, str]:
    """Each operation of the client with the type it answers."""
    text = (HEADERS / "ZarvoPelluxPostClient.h").read_text()
    found = re.finditer(r"^\s+([\w:<>]+(?: [\w:<>]+)*) (\w+)\(([^)]*)\)(?: const)?;", text, re.M)
    return {match.group(2): cpp_type(match.group(1)) for match in found}


def records() -> Dict[str, Dict[str, str]]:
    """The fields and member functions of every record, with their declared types: the fields from
    the records' tables in OutputFields.h, the member functions from Outputs.h."""
    found: Dict[str, Dict[str, str]] = {}
    fields = (HEADERS / "OutputFields.h").read_text()
    for match in re.finditer(r"^#define ZARVO_FIELDS_(\w+)\(FIELD\)((?:.*\\\n)*.*)$", fields, re.M):
        members = found.setdefault(match.group(1), {})
        for field in re.finditer(r"FIELD\(([\w:<> ]+?),\s*(\w+)", match.group(2)):
            members[field.group(2)] = cpp_type(field.group(1))
    text = (HEADERS / "Outputs.h").read_text()
    for match in re.finditer(r"^class (\w+)[^{]*\{(.*?)^\};", text, re.M | re.S):
        members = found.setdefault(match.group(1), {})
        for member in re.finditer(r"^\s+([\w:<>]+(?: [\w:<>]+)*) (\w+)(\(\))?(?: const)?\s*[;{]", match.group(2), re.M):
            members[member.group(2)] = cpp_type(member.group(1))
    return found


def generate_interface() -> str:
    declared = records()
    answers = client_operations()
    lines = [HEAD_LINE, '"""Each record\'s fields with the types a script reads (FIELDS) and what each client operation',
             'answers (ANSWERS), as the client library declares them."""', "", "FIELDS = {"]
    for name, members in Client3.TABLE.items():
        if name in declared:
            fields = ", ".join(f"({field!r}, {FIELD_READ.get(declared[name][field], declared[name][field])!r})"
                               for field in members.fields)
            lines.append(f"    {name!r}: ({fields}{',' if len(members.fields) == 1 else ''}),")
    lines += ["}", "ANSWERS = {"]
    lines += [f"    {name!r}: {answers[name]!r}," for name in Client3.TABLE[Client3.CLIENT].methods]
    return "\n".join(lines + ["}", ""])


def method(name: str, arguments: List[Tuple[str, str]], result: str) -> str:
    listed = "".join(f", {argument}: {kind}" for argument, kind in arguments)
    return f"    def {name}(self{listed}) -> {result}: ...\n"


def loose(name: str) -> str:
    return f"    def {name}(self, *args: Any) -> Any: ...\n"


VECTOR = '''class {name}(MutableSequence[{element}]):
    def __init__(self, *args: Any) -> None: ...
    @overload
    def __getitem__(self, index: int) -> {element}: ...
    @overload
    def __getitem__(self, index: slice) -> {name}: ...
    @overload
    def __setitem__(self, index: int, value: {element}) -> None: ...
    @overload
    def __setitem__(self, index: slice, value: Iterable[{element}]) -> None: ...
    @overload
    def __delitem__(self, index: int) -> None: ...
    @overload
    def __delitem__(self, index: slice) -> None: ...
    def __len__(self) -> int: ...
    def __iter__(self) -> Iterator[{element}]: ...
    def __reversed__(self) -> Iterator[{element}]: ...
    def __eq__(self, other: object) -> bool: ...
    def __ne__(self, other: object) -> bool: ...
    def insert(self, index: int, value: {element}) -> None: ...
    def extend(self, values: Iterable[{element}]) -> None: ...
    def pop(self, index: int = ...) -> {element}: ...
    def append(self, value: {element}) -> None: ...
    def clear(self) -> None: ...
    def reverse(self) -> None: ...
    def view(self) -> memoryview: ...
    def fill(self, buffer: Any) -> None: ...
    @classmethod
    def from_buffer(cls, buffer: Any) -> {name}: ...
    def __array__(self, dtype: Any = ..., copy: Optional[bool] = ...) -> Any: ...
    def __swig_destroy__(self) -> None: ...
'''
VECTOR_TYPED = {"__getitem__", "__setitem__", "__delitem__", "__len__", "insert", "extend", "pop", "append", "clear", "reverse"}
TEXT_VECTOR_TYPED = {"front": "str", "back": "str"}

HEAD = HEAD_LINE + '''
import os
from typing import Any, Dict, Iterable, Iterator, List, MutableSequence, NamedTuple, Optional, Sequence, Tuple, TypeVar, Union, overload

__all__ = {all}
__version__: str

_R = TypeVar("_R", bound="Output_Result")
_TextArgument = Union[str, bytes]
_PathArgument = Union[str, bytes, os.PathLike[str], os.PathLike[bytes]]

Success: int
UnknownStatus: int
NotConnected: int
RequestTimedOut: int
ReplyParsingError: int
ApplicationError: int
InvalidFrameNumber: int
ConversionError: int
ExpectedOneFrame: int
def ToString(code: int, /) -> str: ...

class Error(Exception):
    code: int
    text: str
    command: Optional[str]
    def __init__(self, code: int, text: str, command: Optional[str] = ...) -> None: ...

class Members(NamedTuple):
    fields: Tuple[str, ...]
    methods: Tuple[str, ...]
    constructible: bool
    destructible: bool

TABLE: Dict[str, Members]
VECTORS: Tuple[str, ...]
VIEWABLE: Dict[str, str]
RECORD_BASE: str
CLIENT: str
classes: Dict[str, type]
def base_of(name: str) -> Optional[str]: ...
def register() -> None: ...
def snake_case(name: str) -> str: ...
_INPUTS: Dict[str, Tuple[Tuple[str, ...], Tuple[str, ...]]]
def connect(host: str = ..., port: int = ..., *, raise_errors: bool = ...) -> ZarvoPelluxPostClient: ...

class ParameterVector:
    """A record's parameter list, passed back to ProcessRequest."""
    this: Any
    def __init__(self, proxy: Any, record: Any) -> None: ...

'''


def field(name: str, read: str, cpp: str) -> str:
    """A record's field as a property: text assigned as str or bytes, a vector as any sequence."""
    if cpp == "SafeString":
        written = "Union[str, bytes, SafeString]"
    elif cpp in ELEMENTS:
        written = f"Union[{cpp}, Sequence[{ELEMENTS[cpp]}]]"
    else:
        written = read
    return f"    @property\n    def {name}(self) -> {read}: ...\n    @{name}.setter\n    def {name}(self, value: {written}) -> None: ...\n"


def generate() -> str:
    table = Client3.TABLE
    answers = client_operations()
    declared = records()
    out = [HEAD.format(all=repr(Client3.__all__))]
    for name, members in table.items():
        base = Client3.base_of(name)
        if name in ELEMENTS:
            out.append(VECTOR.format(name=name, element=ELEMENTS[name]))
            typed = TEXT_VECTOR_TYPED if name == "vectorss" else {}
            out += [method(m, [], typed[m]) if m in typed else loose(m) for m in members.methods if m not in VECTOR_TYPED]
            out.append("\n")
            continue
        if name == "SwigPyIterator":
            out.append(f"class {name}(Iterator[Any]):\n    def __next__(self) -> Any: ...\n    def __iter__(self) -> {name}: ...\n")
            out += [loose(m) for m in members.methods if m != "__next__"]
            out.append("    def __swig_destroy__(self) -> None: ...\n\n")
            continue
        out.append(f"class {name}{f'({base})' if base else ''}:\n")
        if members.constructible:
            out.append("    def __init__(self, *args: Any) -> None: ...\n")
        if members.destructible:
            out.append("    def __swig_destroy__(self) -> None: ...\n")
        if name == "SafeString":
            out.append("    def __eq__(self, other: object) -> bool: ...\n    def __hash__(self) -> int: ...\n")
            out += [method(m, [], {"IsEmpty": "bool"}.get(m, "str")) for m in members.methods]
        if name == Client3.CLIENT:
            out.append(f"    def __enter__(self) -> {name}: ...\n    def __exit__(self, *exc: object) -> None: ...\n")
            out += [client_method(operation, answers[operation]) for operation in members.methods]
        if name in declared:
            for member in members.fields:
                cpp = declared[name][member]
                out.append(field(member, FIELD_READ.get(cpp, cpp), cpp))
            out += [method(m, [], declared[name][m]) for m in members.methods]
        if name == "Output_GetTrajectory":
            out.append("    def arrays(self) -> Tuple[Any, Any, Any, Any]: ...\n")
        if name == Client3.RECORD_BASE:
            out.append("    @property\n    def ok(self) -> bool: ...\n    def __bool__(self) -> bool: ...\n"
                       "    def check(self: _R) -> _R: ...\n")
        out.append("\n")
    out.append(f"Client = {Client3.CLIENT}\n\nclass RaisingClient({Client3.CLIENT}): ...\n")
    return "".join(out)


def client_method(name: str, result: str) -> str:
    parameters, kinds = Client3._INPUTS[name]
    settings = answer_of_reader(name)
    types = [settings if kind == "Settings" else WIRE[kind] for kind in kinds]
    return method(name, list(zip(parameters, types)), result)


def answer_of_reader(name: str) -> str:
    """The settings record a settings setter takes: the one its reader answers with."""
    return client_operations().get(name.replace("OfflineSet", "OfflineGet", 1), "Any")


# The functions of Client3._buffers; generate_buffers() fails when the module has others.
BUFFERS = {
    "view": "def view(v: Any, /) -> memoryview: ...",
    "copy": "def copy(v: Any, /) -> Union[memoryview, List[str]]: ...",
    "fill": "def fill(v: Any, buffer: Any) -> None: ...",
    "exports": "def exports(v: Any, /) -> int: ...",
    "guard": "def guard(*vectors: Any) -> None: ...",
    "exporting": "def exporting() -> bool: ...",
}


def generate_buffers() -> str:
    from Client3 import _buffers

    functions = sorted(name for name, value in vars(_buffers).items() if callable(value) and not name.startswith("_"))
    if functions != sorted(BUFFERS):
        raise SystemExit(f"Client3._buffers has the functions {functions}: describe them in BUFFERS")
    lines = [HEAD_LINE, "from typing import Any, List, Union", ""] + [BUFFERS[name] for name in functions]
    return "\n".join(lines + [""])


def main(argv: List[str]) -> int:
    written = {INTERFACE: generate_interface(), STUBS: generate(), BUFFER_STUBS: generate_buffers()}
    if "--check" in argv:
        for path, text in written.items():
            if not path.exists() or path.read_text() != text:
                print(f"{path} differs from the library's declared interface: run python -m Client3._generate", file=sys.stderr)
                return 1
        return 0
    for path, text in written.items():
        path.write_text(text)
    return 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
