// The module entry: runtime singletons, the function table made of every family's functions, the
// shared type ring and the result-code constants.
#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <span>

#include "client/client.h"
#include "containers/iterators.h"
#include "containers/sequence.h"
#include "convert/text.h"
#include "records/record.h"
#include "runtime/runtime.h"

namespace client3 {

namespace {

// The module's constants besides the result codes: none, only the terminator.
struct Constant {
  int kind;
  const char* name;
  long integer;
  double real;
  void* pointer;
  TypeInfo** type;
};
enum { ConstantPointer = 4, ConstantPacked = 5 };
Constant constantTable[] = {{0, nullptr, 0, 0.0, nullptr, nullptr}};

// Every family's functions, in the order the module lists them, and the terminator: the table is
// as long as the families make it. It is kept for the life of the process, as the functions made
// from it point into it.
PyMethodDef* BuildFunctionTable() {
  const std::span<const PyMethodDef> families[] = {IteratorFunctions(), VectorFunctions(), SafeStringFunctions(),
                                                   RecordFunctions(), ClientFunctions()};
  std::size_t count = 0;
  for (auto family : families) count += family.size();
  auto* table = new PyMethodDef[count + 1];
  PyMethodDef* end = table;
  for (auto family : families) end = std::copy(family.begin(), family.end(), end);
  *end = {nullptr, nullptr, 0, nullptr};
  return table;
}

// Points the docs that name a pointer constant ("swig_ptr: NAME") at the constant's value.
void FixMethodDocs(PyMethodDef* methods) {
  static const char marker[] = "swig_ptr: ";
  for (PyMethodDef* def = methods; def->ml_name; ++def) {
    const char* found = def->ml_doc ? std::strstr(def->ml_doc, marker) : nullptr;
    if (!found) continue;
    const char* name = found + sizeof marker - 1;
    for (Constant* constant = constantTable; constant->kind; ++constant) {
      if (std::strncmp(constant->name, name, std::strlen(constant->name)) != 0) continue;
      if (constant->kind != ConstantPointer || !constant->pointer) break;
      const char* mangled = (*constant->type)->mangledName;
      std::size_t head = found - def->ml_doc;
      std::size_t size = head + 10 + std::strlen(mangled) + 10;
      char* doc = static_cast<char*>(std::malloc(size));
      if (!doc) break;
      std::memcpy(doc, def->ml_doc, head);
      char* out = doc + head;
      std::memcpy(out, marker, sizeof marker - 1);
      out += sizeof marker - 1;
      *out++ = '_';
      out = PackHex(out, &constant->pointer, sizeof constant->pointer);
      if (std::strlen(mangled) + 1 <= size - (out - doc)) std::strcpy(out, mangled);
      def->ml_doc = doc;  // kept for the life of the process
      break;
    }
  }
}

void InstallConstants(PyObject* dict) {
  for (Constant* constant = constantTable; constant->kind; ++constant) {
    PyObject* value = nullptr;
    if (constant->kind == ConstantPointer) {
      value = NewPointerObj(nullptr, constant->pointer, *constant->type, 0);
    } else if (constant->kind == ConstantPacked) {
      if (constant->pointer)
        value = SwigPyPacked_New(constant->pointer, static_cast<std::size_t>(constant->integer), *constant->type);
      else
        value = (Py_INCREF(Py_None), Py_None);
    }
    if (value) {
      PyDict_SetItemString(dict, constant->name, value);
      Py_DECREF(value);
    }
  }
}

// The functions are added by AddFunctions rather than through the definition.
PyModuleDef moduleDef = {PyModuleDef_HEAD_INIT, "_Client3", nullptr, -1, nullptr, nullptr, nullptr, nullptr, nullptr};

// Puts the table's functions into the module's dictionary, in table order, bound to the module as
// the interpreter binds a definition's methods. Storing them in the dictionary directly skips the
// attribute machinery, a third of the start-up's work at this table's size.
void AddFunctions(PyObject* module, const PyMethodDef* methods) {
  PyObject* dict = PyModule_GetDict(module);
  PyObject* name = PyModule_GetNameObject(module);
  if (!name) return;
  for (const PyMethodDef* def = methods; def->ml_name; ++def) {
    PyObject* function = PyCFunction_NewEx(const_cast<PyMethodDef*>(def), module, name);
    PyObject* key = function ? PyUnicode_InternFromString(def->ml_name) : nullptr;
    if (key) PyDict_SetItem(dict, key, function);
    Py_XDECREF(key);
    Py_XDECREF(function);
  }
  Py_DECREF(name);
}

const struct {
  const char* name;
  long value;
} resultCodes[] = {
    {"Success", 0},
    {"UnknownStatus", 1},
    {"NotConnected", 1000},
    {"RequestTimedOut", 1001},
    {"ReplyParsingError", 1002},
    {"ApplicationError", 1003},
    {"InvalidFrameNumber", 1004},
    {"ConversionError", 1005},
    {"ExpectedOneFrame", 1006},
};

}  // namespace

}  // namespace client3

PyMODINIT_FUNC PyInit__Client3() {
  using namespace client3;
  ThisName();
  TypeCache();
  SwigPyPacked_type();
  SwigPyObject_type();
  static PyMethodDef* const functionTable = BuildFunctionTable();
  FixMethodDocs(functionTable);
  PyObject* module = PyModule_Create2(&moduleDef, 1013);
  if (!module) return nullptr;
  AddFunctions(module, functionTable);
  PyObject* dict = PyModule_GetDict(module);
  InitializeModule(nullptr);
  InstallConstants(dict);
  ContainerOwnerAttribute();
  for (const auto& code : resultCodes) {
    PyObject* value = PyLong_FromLong(code.value);
    if (value) {
      PyDict_SetItemString(dict, code.name, value);
      Py_DECREF(value);
    }
  }
  return module;
}
