// The two proxy types: SwigPyObject carries a native pointer with its descriptor and ownership;
// SwigPyPacked carries a copy of a small block of bytes with its descriptor.
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <unordered_set>

#include "runtime/runtime.h"

namespace client3 {

namespace {

constexpr const char* kProxyDoc = "Swig object carries a C/C++ instance pointer";

const char* DisplayName(const TypeInfo* type) {
  const char* name = PrettyTypeName(type);
  return name ? name : "unknown";
}

SwigPyObject* AsProxy(PyObject* op) { return reinterpret_cast<SwigPyObject*>(op); }

// ---- SwigPyObject -----------------------------------------------------------------------------

// The proxy's text, followed by those of the proxies chained after it. The chain is walked, not
// recursed into, and ends where it comes back to a proxy already shown: `append` can make it loop.
PyObject* ProxyRepr(PyObject* op, PyObject* = nullptr) {
  PyObject* repr = PyUnicode_FromString("");
  std::unordered_set<PyObject*> shown;
  for (PyObject* at = op; repr && at && shown.insert(at).second; at = AsProxy(at)->next) {
    PyObject* part = PyUnicode_FromFormat("<Swig Object of type '%s' at %p>", DisplayName(AsProxy(at)->type), at);
    PyObject* joined = part ? PyUnicode_Concat(repr, part) : nullptr;
    Py_DECREF(repr);
    Py_XDECREF(part);
    repr = joined;
  }
  return repr;
}

PyObject* ProxyDisown(PyObject* op, PyObject* = nullptr) {
  AsProxy(op)->own = 0;
  Py_RETURN_NONE;
}

PyObject* ProxyAcquire(PyObject* op, PyObject* = nullptr) {
  AsProxy(op)->own = PointerOwn;
  Py_RETURN_NONE;
}

PyObject* ProxyOwn(PyObject* op, PyObject* args) {
  PyObject* value = nullptr;
  if (!UnpackTuple(args, "own", 0, 1, &value)) return nullptr;
  PyObject* result = PyBool_FromLong(AsProxy(op)->own);
  if (value) {
    // The setting call's None is kept, as the proxy protocol has always done.
    if (PyObject_IsTrue(value))
      ProxyAcquire(op);
    else
      ProxyDisown(op);
  }
  return result;
}

}  // namespace

char* PackHex(char* out, const void* data, std::size_t size) {
  static const char hex[] = "0123456789abcdef";
  const unsigned char* bytes = static_cast<const unsigned char*>(data);
  for (std::size_t i = 0; i < size; ++i) {
    *out++ = hex[bytes[i] >> 4];
    *out++ = hex[bytes[i] & 0xf];
  }
  *out = 0;
  return out;
}

PyObject* SwigPyObject_append(PyObject* op, PyObject* other) {
  if (!SwigPyObject_Check(other)) {
    PyErr_SetString(PyExc_TypeError, "Attempt to append a non SwigPyObject");
    return nullptr;
  }
  // A chain already present is overwritten without being released.
  AsProxy(op)->next = other;
  Py_INCREF(other);
  Py_RETURN_NONE;
}

namespace {

PyObject* ProxyNext(PyObject* op, PyObject* = nullptr) {
  PyObject* next = AsProxy(op)->next;
  if (next) {
    Py_INCREF(next);
    return next;
  }
  Py_RETURN_NONE;
}

PyObject* ProxyLong(PyObject* op) { return PyLong_FromVoidPtr(AsProxy(op)->ptr); }

PyObject* ProxyCompare(PyObject* a, PyObject* b, int op) {
  // A right operand that is no proxy has no address to compare; the interpreter then falls back
  // to identity.
  if ((op != Py_EQ && op != Py_NE) || !SwigPyObject_Check(b)) {
    Py_INCREF(Py_NotImplemented);
    return Py_NotImplemented;
  }
  auto left = reinterpret_cast<std::uintptr_t>(AsProxy(a)->ptr);
  auto right = reinterpret_cast<std::uintptr_t>(AsProxy(b)->ptr);
  return PyBool_FromLong((left == right) == (op == Py_EQ));
}

void ProxyDealloc(PyObject* op) {
  SwigPyObject* self = AsProxy(op);
  if (self->own == PointerOwn) {
    TypeInfo* type = self->type;
    ClientData* data = type ? type->clientData : nullptr;
    PyObject* destroy = data ? data->destroy : nullptr;
    if (!destroy) {
      std::printf("swig/python detected a memory leak of type '%s', no destructor found.\n", DisplayName(type));
    } else {
      PyObject *errType, *errValue, *errTrace;
      PyErr_Fetch(&errType, &errValue, &errTrace);
      PyObject* result;
      if (data->destroyTakesTuple) {
        PyObject* temporary = NewPointerObj(nullptr, self->ptr, type, PointerNoShadow);
        result = temporary ? PyObject_CallFunctionObjArgs(destroy, temporary, nullptr) : nullptr;
        Py_XDECREF(temporary);
      } else {
        PyCFunction function = PyCFunction_GET_FUNCTION(destroy);
        PyObject* bound = (PyCFunction_GET_FLAGS(destroy) & METH_STATIC) ? nullptr : PyCFunction_GET_SELF(destroy);
        result = function(bound, op);
      }
      if (!result) PyErr_WriteUnraisable(destroy);
      PyErr_Restore(errType, errValue, errTrace);
      Py_XDECREF(result);
    }
  }
  Py_XDECREF(self->next);
  PyObject_Free(op);
}

PyMethodDef proxyMethods[] = {
    {"disown", ProxyDisown, METH_NOARGS, "releases ownership of the pointer"},
    {"acquire", ProxyAcquire, METH_NOARGS, "acquires ownership of the pointer"},
    {"own", ProxyOwn, METH_VARARGS, "returns/sets ownership of the pointer"},
    {"append", SwigPyObject_append, METH_O, "appends another 'this' object"},
    {"next", ProxyNext, METH_NOARGS, "returns the next 'this' object"},
    {"__repr__", ProxyRepr, METH_NOARGS, "returns object representation"},
    {nullptr, nullptr, 0, nullptr},
};

// ---- SwigPyPacked -----------------------------------------------------------------------------

SwigPyPacked* AsPacked(PyObject* op) { return reinterpret_cast<SwigPyPacked*>(op); }

// Fills `buffer` with "_" and the hexadecimal bytes when they fit in it.
bool PackedHex(const SwigPyPacked* self, char (&buffer)[1024]) {
  if (2 * self->size + 2 > sizeof buffer) return false;
  buffer[0] = '_';
  PackHex(buffer + 1, self->pack, self->size);
  return true;
}

PyObject* PackedRepr(PyObject* op) {
  SwigPyPacked* self = AsPacked(op);
  char hex[1024];
  if (PackedHex(self, hex)) return PyUnicode_FromFormat("<Swig Packed at %s%s>", hex, self->type->mangledName);
  return PyUnicode_FromFormat("<Swig Packed %s>", self->type->mangledName);
}

PyObject* PackedStr(PyObject* op) {
  SwigPyPacked* self = AsPacked(op);
  char hex[1024];
  if (PackedHex(self, hex)) return PyUnicode_FromFormat("%s%s", hex, self->type->mangledName);
  return PyUnicode_FromString(self->type->mangledName);
}

void PackedDealloc(PyObject* op) {
  if (SwigPyPacked_Check(op)) std::free(AsPacked(op)->pack);
  PyObject_Free(op);
}

bool HasTypeName(PyObject* op, const char* name) { return std::strcmp(Py_TYPE(op)->tp_name, name) == 0; }

// A type object with only its header set; the interpreter's header macro leaves the rest to zero.
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wmissing-field-initializers"
constexpr PyTypeObject kEmptyType = {PyVarObject_HEAD_INIT(nullptr, 0)};
#pragma GCC diagnostic pop

}  // namespace

PyTypeObject* proxyType = nullptr;

PyTypeObject* SwigPyObject_type() {
  static PyTypeObject* type = [] {
    static PyNumberMethods number{};
    number.nb_int = ProxyLong;
    static PyTypeObject t = kEmptyType;
    t.tp_name = "SwigPyObject";
    t.tp_basicsize = sizeof(SwigPyObject);
    t.tp_dealloc = ProxyDealloc;
    t.tp_repr = [](PyObject* op) { return ProxyRepr(op); };
    t.tp_as_number = &number;
    t.tp_getattro = PyObject_GenericGetAttr;
    t.tp_flags = Py_TPFLAGS_DEFAULT;
    t.tp_doc = kProxyDoc;
    t.tp_richcompare = ProxyCompare;
    t.tp_methods = proxyMethods;
    return proxyType = PyType_Ready(&t) == 0 ? &t : nullptr;
  }();
  return type;
}

PyTypeObject* SwigPyPacked_type() {
  static PyTypeObject* type = [] {
    static PyTypeObject t = kEmptyType;
    t.tp_name = "SwigPyPacked";
    t.tp_basicsize = sizeof(SwigPyPacked);
    t.tp_dealloc = PackedDealloc;
    t.tp_repr = PackedRepr;
    t.tp_str = PackedStr;
    t.tp_getattro = PyObject_GenericGetAttr;
    t.tp_flags = Py_TPFLAGS_DEFAULT;
    t.tp_doc = kProxyDoc;
    return PyType_Ready(&t) == 0 ? &t : nullptr;
  }();
  return type;
}

bool SwigPyObject_Check(PyObject* op) {
  return Py_TYPE(op) == SwigPyObject_type() || HasTypeName(op, "SwigPyObject");
}

bool SwigPyPacked_Check(PyObject* op) {
  return Py_TYPE(op) == SwigPyPacked_type() || HasTypeName(op, "SwigPyPacked");
}

PyObject* SwigPyPacked_New(void* data, std::size_t size, TypeInfo* type) {
  SwigPyPacked* self = PyObject_New(SwigPyPacked, SwigPyPacked_type());
  if (!self) return nullptr;
  void* pack = std::malloc(size ? size : 1);
  if (!pack) {
    PyObject_Free(self);
    return nullptr;
  }
  std::memcpy(pack, data, size);
  self->pack = pack;
  self->type = type;
  self->size = size;
  return reinterpret_cast<PyObject*>(self);
}

}  // namespace client3
