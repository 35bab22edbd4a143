"""Writes the type stubs Client3/__init__.pyi from the module's function table and the client
library's declared interface, so that the stubs name exactly the classes, methods and properties
that Client3 builds at import.

    python -m Client3._generate            # rewrite the stubs (and those of Client3._buffers)
    python -m Client3._generate --check    # exit 1 when the stubs on disk differ

Run from the repository: the argument and field types are read from include/ and the argument
names from the command catalogue in protocol/.
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
BUFFER_STUBS = PACKAGE / "_buffers.pyi"
HEADERS = ROOT / "include" / "ZarvoSDKClientCPP"
CATALOGUE = ROOT / "protocol" / "catalogue.h"

ELEMENTS = {"vectorb": "bool", "vectord": "float", "vectorf": "float", "vectori": "int", "vectorull": "int", "vectorss": "SafeString"}
VECTOR_OF = {"bool": "vectorb", "double": "vectord", "float": "vectorf", "int": "vectori", "unsigned long long": "vectorull", "SafeString": "vectorss", "Type_Parameter": "_ParameterVector"}
SCALARS = {"bool": "bool", "int": "int", "unsigned int": "int", "unsigned long long": "int", "float": "float", "double": "float", "ResultCode::Enum": "int", "void": "None", "std::string": "str", "SafeString": "SafeString"}
# Connect is not a command of the application, so the catalogue does not name its arguments.
NAMES = {"Connect": ["address", "port"]}


def python_type(cpp: str, argument: bool) -> str:
    cpp = cpp.replace("const&", "").replace("&", "").strip()
    vector = re.fullmatch(r"std::vector<(.+)>", cpp)
    if vector:
        name = VECTOR_OF[vector.group(1)]
        if argument and name in ELEMENTS:
            return f"Union[{name}, Sequence[{ELEMENTS[name]}]]"
        return name
    if argument and cpp == "SafeString":
        return "Union[str, bytes]"
    return SCALARS.get(cpp, cpp)


def catalogue_inputs() -> Dict[str, List[str]]:
    inputs: Dict[str, List[str]] = {}
    for line in CATALOGUE.read_text().splitlines():
        command = re.match(r'\s*X\((\w+), [\w ]+, "(?:[^"\\]|\\.)*", \(', line)
        if command:
            depth, start = 1, command.end()
            end = start
            while depth:
                depth += {"(": 1, ")": -1}.get(line[end], 0)
                end += 1
            inputs[command.group(1)] = [name.lower() for name in re.findall(r'P\("(\w+)"', line[start:end])]
    return inputs


def client_operations() -> Dict[str, Tuple[str, List[str]]]:
    text = (HEADERS / "ZarvoPelluxPostClient.h").read_text()
    operations = {}
    for match in re.finditer(r"^\s+([\w:<>]+(?: [\w:<>]+)*) (\w+)\(([^)]*)\)(?: const)?;", text, re.M):
        result, name, arguments = match.groups()
        operations[name] = (result, [a.strip() for a in arguments.split(",")] if arguments.strip() else [])
    return operations


def records() -> Dict[str, Dict[str, str]]:
    """The fields and member functions of every record, with their declared types: the fields from
    the records' tables in OutputFields.h, the member functions from Outputs.h."""
    found: Dict[str, Dict[str, str]] = {}
    fields = (HEADERS / "OutputFields.h").read_text()
    for match in re.finditer(r"^#define ZARVO_FIELDS_(\w+)\(FIELD\)((?:.*\\\n)*.*)$", fields, re.M):
        members = found.setdefault(match.group(1), {})
        for field in re.finditer(r"FIELD\(([\w:<> ]+?),\s*(\w+)", match.group(2)):
            members[field.group(2)] = field.group(1)
    text = (HEADERS / "Outputs.h").read_text()
    for match in re.finditer(r"^class (\w+)[^{]*\{(.*?)^\};", text, re.M | re.S):
        members = found.setdefault(match.group(1), {})
        for member in re.finditer(r"^\s+([\w:<>]+(?: [\w:<>]+)*) (\w+)(\(\))?(?: const)?\s*[;{]", match.group(2), re.M):
            members[member.group(2)] = member.group(1)
    return found


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
    def view(self) -> memoryview: ...
    def fill(self, buffer: Any) -> None: ...
    @classmethod
    def from_buffer(cls, buffer: Any) -> {name}: ...
    def __array__(self, dtype: Any = ..., copy: Optional[bool] = ...) -> Any: ...
'''
VECTOR_TYPED = {"__getitem__", "__setitem__", "__delitem__", "__len__", "insert", "extend", "pop", "append", "clear"}

HEAD = '''# Written by Client3/_generate.py from the module's function table; do not edit by hand.
from typing import Any, Callable, Dict, Iterable, Iterator, MutableSequence, NamedTuple, Optional, Sequence, Tuple, TypeVar, Union, overload

_R = TypeVar("_R", bound="Output_Result")

Success: int
UnknownStatus: int
NotConnected: int
RequestTimedOut: int
ReplyParsingError: int
ApplicationError: int
InvalidFrameNumber: int
ConversionError: int
ExpectedOneFrame: int
def ToString(code: int) -> str: ...

class Error(Exception):
    code: int
    text: str
    def __init__(self, code: int, text: str) -> None: ...

class Members(NamedTuple):
    fields: Tuple[str, ...]
    methods: Tuple[str, ...]
    constructible: bool
    destructible: bool

TABLE: Dict[str, Members]
VECTORS: Tuple[str, ...]
VIEWABLE: Dict[str, str]
RECORD_BASE: str
classes: Dict[str, type]
def base_of(name: str) -> Optional[str]: ...
def register() -> None: ...
def connect(host: str = ..., port: int = ...) -> ZarvoPelluxPostClient: ...

class _ParameterVector:
    """The parameter vector: opaque, passed from one operation to the next."""

'''


def generate() -> str:
    table = Client3.TABLE
    operations = client_operations()
    declared = records()
    names = catalogue_inputs()
    out = [HEAD]
    for name, members in table.items():
        base = Client3.base_of(name)
        if name in ELEMENTS:
            out.append(VECTOR.format(name=name, element=ELEMENTS[name]))
            out += [loose(m) for m in members.methods if m not in VECTOR_TYPED]
            out.append("\n")
            continue
        if name == "SwigPyIterator":
            out.append(f"class {name}(Iterator[Any]):\n    def __next__(self) -> Any: ...\n    def __iter__(self) -> {name}: ...\n")
            out += [loose(m) for m in members.methods if m != "__next__"]
            out.append("\n")
            continue
        out.append(f"class {name}{f'({base})' if base else ''}:\n")
        if members.constructible:
            out.append("    def __init__(self, *args: Any) -> None: ...\n")
        if name == "SafeString":
            out.append("    def __eq__(self, other: object) -> bool: ...\n    def __hash__(self) -> int: ...\n")
            out += [method(m, [], {"IsEmpty": "bool"}.get(m, "str")) for m in members.methods]
        if name == "ZarvoPelluxPostClient":
            out.append(f"    def __enter__(self) -> {name}: ...\n    def __exit__(self, *exc: object) -> None: ...\n")
            for operation in members.methods:
                result, arguments = operations[operation]
                given = NAMES.get(operation) or names.get(operation, [])
                if len(given) != len(arguments):
                    given = [f"arg{i + 1}" for i in range(len(arguments))]
                typed = [(argument, python_type(kind, True)) for argument, kind in zip(given, arguments)]
                out.append(method(operation, typed, python_type(result, False)))
        if name in declared:
            for field in members.fields:
                kind = python_type(declared[name][field], False)
                out.append(f"    @property\n    def {field}(self) -> {kind}: ...\n    @{field}.setter\n    def {field}(self, value: {kind}) -> None: ...\n")
            out += [method(m, [], python_type(declared[name][m], False)) for m in members.methods]
        if name == "Output_GetTrajectory":
            out.append("    def arrays(self) -> Tuple[Any, Any, Any, Any]: ...\n")
        if name == Client3.RECORD_BASE:
            out.append("    @property\n    def ok(self) -> bool: ...\n    def check(self: _R) -> _R: ...\n")
        out.append("\n")
    out.append("Client = ZarvoPelluxPostClient\n")
    return "".join(out)


# The functions of Client3._buffers; generate_buffers() fails when the module has others.
BUFFERS = {
    "view": "def view(v: Any) -> memoryview: ...",
    "copy": "def copy(v: Any) -> Union[memoryview, List[str]]: ...",
    "fill": "def fill(v: Any, buffer: Any) -> None: ...",
    "exports": "def exports(v: Any) -> int: ...",
    "guard": "def guard(*vectors: Any) -> None: ...",
    "exporting": "def exporting() -> bool: ...",
}


def generate_buffers() -> str:
    from Client3 import _buffers

    functions = sorted(name for name, value in vars(_buffers).items() if callable(value) and not name.startswith("_"))
    if functions != sorted(BUFFERS):
        raise SystemExit(f"Client3._buffers has the functions {functions}: describe them in BUFFERS")
    lines = [HEAD.splitlines()[0], "from typing import Any, List, Union", ""] + [BUFFERS[name] for name in functions]
    return "\n".join(lines) + "\n"


def main(argv: List[str]) -> int:
    written = {STUBS: generate(), BUFFER_STUBS: generate_buffers()}
    if "--check" in argv:
        for path, text in written.items():
            if not path.exists() or path.read_text() != text:
                print(f"{path} differs from the module's function table: run python -m Client3._generate", file=sys.stderr)
                return 1
        return 0
    for path, text in written.items():
        path.write_text(text)
    return 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
