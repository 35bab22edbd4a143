// Client3._catalogue: the application's command catalogue as Python data, so that the Client3
// package names its methods' parameters and writes their docs without reading C++ text.
//
//   COMMANDS: a tuple of (name, description, inputs, outputs), one per command in catalogue order;
//   inputs and outputs are tuples of (name, type) pairs, the type being the wire type's name.
#include <Python.h>

#include <cstddef>
#include <span>
#include <string_view>

#include "protocol/catalogue.h"

namespace {

using client3::protocol::Param;
using client3::protocol::Type;

constexpr std::string_view TypeName(Type type) {
  switch (type) {
    case Type::String: return "String";
    case Type::Int: return "Int";
    case Type::UInt: return "UInt";
    case Type::ULong: return "ULong";
    case Type::Bool: return "Bool";
    case Type::Float: return "Float";
    case Type::Double: return "Double";
    case Type::Strings: return "Strings";
    case Type::Bools: return "Bools";
    case Type::Floats: return "Floats";
    case Type::Doubles: return "Doubles";
    case Type::Ints: return "Ints";
    case Type::ULongs: return "ULongs";
    case Type::Params: return "Params";
  }
  return "";
}

PyObject* Text(std::string_view text) {
  return PyUnicode_FromStringAndSize(text.data(), static_cast<Py_ssize_t>(text.size()));
}

PyObject* Params(std::span<const Param> params) {
  PyObject* tuple = PyTuple_New(static_cast<Py_ssize_t>(params.size()));
  for (std::size_t i = 0; tuple && i < params.size(); ++i) {
    PyObject* name = Text(params[i].name);
    PyObject* type = Text(TypeName(params[i].type));
    PyObject* pair = name && type ? PyTuple_Pack(2, name, type) : nullptr;
    Py_XDECREF(name);
    Py_XDECREF(type);
    if (!pair) Py_CLEAR(tuple);
    else PyTuple_SET_ITEM(tuple, static_cast<Py_ssize_t>(i), pair);
  }
  return tuple;
}

PyObject* Commands() {
  const auto& commands = client3::protocol::kCommands;
  PyObject* tuple = PyTuple_New(static_cast<Py_ssize_t>(std::size(commands)));
  for (std::size_t i = 0; tuple && i < std::size(commands); ++i) {
    PyObject* name = Text(commands[i].name);
    PyObject* description = Text(commands[i].description);
    PyObject* in = Params(commands[i].in);
    PyObject* out = Params(commands[i].out);
    PyObject* command = name && description && in && out ? PyTuple_Pack(4, name, description, in, out) : nullptr;
    Py_XDECREF(name);
    Py_XDECREF(description);
    Py_XDECREF(in);
    Py_XDECREF(out);
    if (!command) Py_CLEAR(tuple);
    else PyTuple_SET_ITEM(tuple, static_cast<Py_ssize_t>(i), command);
  }
  return tuple;
}

int Exec(PyObject* module) {
  PyObject* commands = Commands();
  if (!commands) return -1;
  int added = PyModule_AddObject(module, "COMMANDS", commands);
  if (added < 0) Py_DECREF(commands);
  return added;
}

PyModuleDef_Slot slots[] = {{Py_mod_exec, reinterpret_cast<void*>(Exec)}, {0, nullptr}};

PyModuleDef moduleDef = {
    PyModuleDef_HEAD_INIT,
    "_catalogue",
    "The application's commands: COMMANDS holds (name, description, inputs, outputs) for each, inputs\n"
    "and outputs as (name, wire type) pairs.",
    0,
    nullptr,
    slots,
    nullptr,
    nullptr,
    nullptr,
};

}  // namespace

PyMODINIT_FUNC PyInit__catalogue() { return PyModuleDef_Init(&moduleDef); }
