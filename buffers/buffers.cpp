// Client3._buffers: the numeric vectors of _Client3 as buffers, without copies, and bulk filling of a
// vector from any buffer. A second module of the family: it joins the shared type ring at import, so
// the vector proxies that _Client3 hands out convert here exactly as they do there.
//
// Every view is counted against the address of the vector it shows, so that the Client3 classes can
// refuse to change the size of a vector (which may move its storage) while a view of it is exported.
#include <bit>
#include <cfloat>
#include <climits>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <type_traits>
#include <unordered_map>
#include <utility>
#include <vector>

#include "runtime/runtime.h"
#include "types/types.h"

namespace client3 {
namespace {

using ZarvoSDKClientCPP::SafeString;

enum class Kind { Double, Float, Int, ULL, Bool, Text };

struct Element {
  Kind kind;
  TypeId type;
  const char* name;
  const char* format;  // the element's buffer format; the bits of a vectorb are copied out as '?'
  Py_ssize_t size;
};

constexpr Element kElements[] = {
    {Kind::Double, p_Vector_double, "vectord", "d", sizeof(double)},
    {Kind::Float, p_Vector_float, "vectorf", "f", sizeof(float)},
    {Kind::Int, p_Vector_int, "vectori", "i", sizeof(int)},
    {Kind::ULL, p_Vector_unsigned_long_long, "vectorull", "Q", sizeof(unsigned long long)},
    {Kind::Bool, p_Vector_bool, "vectorb", "?", sizeof(bool)},
    {Kind::Text, p_Vector_SafeString, "vectorss", nullptr, 0},
};

struct Vector {
  const Element* element = nullptr;
  void* pointer = nullptr;  // the std::vector of the element's type
};

bool Contiguous(const Element& element) { return element.kind != Kind::Bool && element.kind != Kind::Text; }

// The vector behind a proxy (or behind an object whose "this" is one), or no element when the
// object is not one of the six vectors.
Vector Find(PyObject* object) {
  if (object == Py_None) return {};
  for (const Element& element : kElements) {
    void* pointer = nullptr;
    if (ConvertPtr(object, &pointer, Type(element.type), 0) >= 0 && pointer) return {&element, pointer};
  }
  return {};
}

Vector FindOrRaise(PyObject* object, const char* function, bool contiguousOnly) {
  Vector found = Find(object);
  if (!found.element)
    PyErr_Format(PyExc_TypeError, "%s() argument 1 must be a %s, not %.200s", function,
                 contiguousOnly ? "vectord, vectorf, vectori or vectorull" : "vector of _Client3",
                 Py_TYPE(object)->tp_name);
  return found;
}

// The storage of a contiguous vector and its element count.
template <class T>
std::pair<void*, Py_ssize_t> StorageOf(void* vector) {
  auto* v = static_cast<std::vector<T>*>(vector);
  return {v->data(), static_cast<Py_ssize_t>(v->size())};
}

std::pair<void*, Py_ssize_t> Storage(const Vector& v) {
  switch (v.element->kind) {
    case Kind::Double: return StorageOf<double>(v.pointer);
    case Kind::Float: return StorageOf<float>(v.pointer);
    case Kind::Int: return StorageOf<int>(v.pointer);
    case Kind::ULL: return StorageOf<unsigned long long>(v.pointer);
    default: return {nullptr, 0};
  }
}

// ---- Export counts ----------------------------------------------------------------------------

// Exported buffers per vector address. Several proxies may show the same vector (a record field read
// twice), so the count belongs to the vector, not to a proxy.
std::unordered_map<const void*, Py_ssize_t>& Exports() {
  static auto* exports = new std::unordered_map<const void*, Py_ssize_t>();
  return *exports;
}

Py_ssize_t ExportsOf(const void* vector) {
  auto found = Exports().find(vector);
  return found == Exports().end() ? 0 : found->second;
}

PyObject* RefuseResize(const Vector& v) {
  Py_ssize_t count = ExportsOf(v.pointer);
  PyErr_Format(PyExc_BufferError, "cannot change the size of a %s while %zd view%s of it %s exported", v.element->name,
               count, count == 1 ? "" : "s", count == 1 ? "is" : "are");
  return nullptr;
}

// ---- The exporter -----------------------------------------------------------------------------

// What a view's memoryview is made from: it keeps the vector's proxy object (and the record that a
// field vector belongs to) alive for as long as any buffer of it is held.
struct Exporter {
  PyObject_HEAD
  PyObject* vector;
  PyObject* record;
  const Element* element;
  void* pointer;
};

// Shape and strides of one exported buffer, freed when the buffer is released.
struct Layout {
  Py_ssize_t shape;
  Py_ssize_t stride;
};

// An empty vector may have no storage at all; its views point here instead of at null.
double emptyStorage;

int GetBuffer(PyObject* op, Py_buffer* view, int flags) {
  auto* self = reinterpret_cast<Exporter*>(op);
  auto [data, size] = Storage({self->element, self->pointer});
  auto* layout = new Layout{size, self->element->size};
  Py_INCREF(op);
  view->obj = op;
  view->buf = data ? data : &emptyStorage;
  view->len = size * self->element->size;
  view->readonly = 0;
  view->itemsize = self->element->size;
  view->format = (flags & PyBUF_FORMAT) == PyBUF_FORMAT ? const_cast<char*>(self->element->format) : nullptr;
  view->ndim = 1;
  view->shape = (flags & PyBUF_ND) == PyBUF_ND ? &layout->shape : nullptr;
  view->strides = (flags & PyBUF_STRIDES) == PyBUF_STRIDES ? &layout->stride : nullptr;
  view->suboffsets = nullptr;
  view->internal = layout;
  ++Exports()[self->pointer];
  return 0;
}

void ReleaseBuffer(PyObject* op, Py_buffer* view) {
  auto* self = reinterpret_cast<Exporter*>(op);
  delete static_cast<Layout*>(view->internal);
  auto found = Exports().find(self->pointer);
  if (found != Exports().end() && --found->second <= 0) Exports().erase(found);
}

void ExporterDealloc(PyObject* op) {
  auto* self = reinterpret_cast<Exporter*>(op);
  Py_XDECREF(self->vector);
  Py_XDECREF(self->record);
  PyObject_Free(op);
}

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wmissing-field-initializers"
PyBufferProcs exporterBuffer = {GetBuffer, ReleaseBuffer};
PyTypeObject exporterType = {PyVarObject_HEAD_INIT(nullptr, 0)};
#pragma GCC diagnostic pop

// ---- view, copy, exports, guard ---------------------------------------------------------------

PyObject* View(PyObject*, PyObject* object) {
  Vector v = FindOrRaise(object, "view", true);
  if (!v.element) return nullptr;
  if (!Contiguous(*v.element))
    return PyErr_Format(PyExc_TypeError, "a %s has no contiguous storage to view: copy() it instead", v.element->name);
  auto* exporter = PyObject_New(Exporter, &exporterType);
  if (!exporter) return nullptr;
  Py_INCREF(object);
  exporter->vector = object;
  exporter->element = v.element;
  exporter->pointer = v.pointer;
  // The Client3 classes give a vector read from a record field the attribute _record: holding it
  // here as well keeps the record even if the attribute goes.
  exporter->record = PyObject_GetAttrString(object, "_record");
  if (!exporter->record) PyErr_Clear();
  PyObject* view = PyMemoryView_FromObject(reinterpret_cast<PyObject*>(exporter));
  Py_DECREF(exporter);
  return view;
}

// A memoryview of the given format over a new bytearray of `bytes`.
PyObject* TypedCopy(const void* data, Py_ssize_t bytes, const char* format) {
  PyObject* array = PyByteArray_FromStringAndSize(static_cast<const char*>(data), bytes);
  if (!array) return nullptr;
  PyObject* raw = PyMemoryView_FromObject(array);
  Py_DECREF(array);
  if (!raw) return nullptr;
  PyObject* typed = PyObject_CallMethod(raw, "cast", "s", format);
  Py_DECREF(raw);
  return typed;
}

PyObject* Copy(PyObject*, PyObject* object) {
  Vector v = FindOrRaise(object, "copy", false);
  if (!v.element) return nullptr;
  if (v.element->kind == Kind::Text) {
    auto& texts = *static_cast<std::vector<SafeString>*>(v.pointer);
    PyObject* list = PyList_New(static_cast<Py_ssize_t>(texts.size()));
    for (std::size_t i = 0; list && i < texts.size(); ++i) {
      const char* text = texts[i].Text();
      PyObject* item = PyUnicode_DecodeUTF8(text ? text : "", text ? static_cast<Py_ssize_t>(std::strlen(text)) : 0,
                                            "surrogateescape");
      if (!item) Py_CLEAR(list);
      else PyList_SET_ITEM(list, static_cast<Py_ssize_t>(i), item);
    }
    return list;
  }
  if (v.element->kind == Kind::Bool) {
    auto& bits = *static_cast<std::vector<bool>*>(v.pointer);
    std::vector<unsigned char> bytes(bits.begin(), bits.end());
    return TypedCopy(bytes.data(), static_cast<Py_ssize_t>(bytes.size()), "?");
  }
  auto [data, size] = Storage(v);
  return TypedCopy(data, size * v.element->size, v.element->format);
}

PyObject* ExportCount(PyObject*, PyObject* object) {
  Vector v = FindOrRaise(object, "exports", false);
  return v.element ? PyLong_FromSsize_t(ExportsOf(v.pointer)) : nullptr;
}

PyObject* Guard(PyObject*, PyObject* args) {
  if (Exports().empty()) Py_RETURN_NONE;
  for (Py_ssize_t i = 0; i < PyTuple_GET_SIZE(args); ++i) {
    Vector v = Find(PyTuple_GET_ITEM(args, i));
    if (v.element && ExportsOf(v.pointer) > 0) return RefuseResize(v);
  }
  Py_RETURN_NONE;
}

PyObject* Exporting(PyObject*, PyObject*) { return PyBool_FromLong(!Exports().empty()); }

// ---- fill -------------------------------------------------------------------------------------

// The element letter of a buffer format in the machine's own byte order, or 0.
char Letter(const char* format) {
  if (!format) return 'B';
  constexpr bool little = std::endian::native == std::endian::little;
  char order = *format;
  if (order == '@' || order == '=' || order == (little ? '<' : '>') || (!little && order == '!')) ++format;
  return format[0] && !format[1] ? format[0] : 0;
}

// One source element as a signed or unsigned 64-bit integer, by the source's width.
struct Integer {
  bool negative;
  std::uint64_t magnitude;  // the value itself when not negative
  long long Signed() const { return negative ? static_cast<long long>(0 - magnitude) : static_cast<long long>(magnitude); }
};

template <class S>
Integer ReadAs(const char* at) {
  S value;
  std::memcpy(&value, at, sizeof value);
  if constexpr (std::is_signed_v<S>)
    if (value < 0) return {true, 0 - static_cast<std::uint64_t>(static_cast<long long>(value))};
  return {false, static_cast<std::uint64_t>(value)};
}

Integer ReadInteger(const char* at, Py_ssize_t size, bool isSigned) {
  switch (size) {
    case 1: return isSigned ? ReadAs<std::int8_t>(at) : ReadAs<std::uint8_t>(at);
    case 2: return isSigned ? ReadAs<std::int16_t>(at) : ReadAs<std::uint16_t>(at);
    case 4: return isSigned ? ReadAs<std::int32_t>(at) : ReadAs<std::uint32_t>(at);
    default: return isSigned ? ReadAs<std::int64_t>(at) : ReadAs<std::uint64_t>(at);
  }
}

bool IsInteger(char letter, Py_ssize_t size, bool* isSigned) {
  *isSigned = std::strchr("bhilqn", letter) != nullptr;
  return letter && std::strchr("bhilqnBHILQN", letter) && (size == 1 || size == 2 || size == 4 || size == 8);
}

struct Source {
  const char* data;
  Py_ssize_t count;
  Py_ssize_t itemsize;
  char letter;
};

PyObject* OutOfRange(const Element& element, Py_ssize_t index, PyObject* value) {
  if (value)
    PyErr_Format(PyExc_OverflowError, "fill(): element %zd (%R) is out of range for %s", index, value, element.name);
  Py_XDECREF(value);
  return nullptr;
}

PyObject* WrongSource(const Element& element, const char* format) {
  return PyErr_Format(PyExc_TypeError, "fill(): a %s cannot be filled from a buffer of format '%s'", element.name,
                      format ? format : "B");
}

// The source's elements converted to T, with the range checks of T; false with an exception set when
// a value does not fit or the source's type does not match.
template <class T>
bool Convert(const Element& element, const Source& source, const char* format, std::vector<T>& out) {
  out.resize(static_cast<std::size_t>(source.count));
  const char* at = source.data;
  if constexpr (std::is_same_v<T, bool>) {
    if (source.letter != '?' || source.itemsize != 1) return WrongSource(element, format), false;
    for (Py_ssize_t i = 0; i < source.count; ++i) out[static_cast<std::size_t>(i)] = at[i] != 0;
    return true;
  } else if constexpr (std::is_floating_point_v<T>) {
    if (source.letter == 'd' && source.itemsize == sizeof(double)) {
      for (Py_ssize_t i = 0; i < source.count; ++i, at += sizeof(double)) {
        double value;
        std::memcpy(&value, at, sizeof value);
        if constexpr (std::is_same_v<T, float>)
          if (std::isfinite(value) && (value < -FLT_MAX || value > FLT_MAX))
            return OutOfRange(element, i, PyFloat_FromDouble(value)), false;
        out[static_cast<std::size_t>(i)] = static_cast<T>(value);
      }
      return true;
    }
    if (source.letter == 'f' && source.itemsize == sizeof(float)) {
      for (Py_ssize_t i = 0; i < source.count; ++i, at += sizeof(float)) {
        float value;
        std::memcpy(&value, at, sizeof value);
        out[static_cast<std::size_t>(i)] = value;
      }
      return true;
    }
    return WrongSource(element, format), false;
  } else {
    bool isSigned;
    if (!IsInteger(source.letter, source.itemsize, &isSigned)) return WrongSource(element, format), false;
    for (Py_ssize_t i = 0; i < source.count; ++i, at += source.itemsize) {
      Integer value = ReadInteger(at, source.itemsize, isSigned);
      bool fits = std::is_signed_v<T> ? (value.negative ? value.magnitude <= static_cast<std::uint64_t>(INT_MAX) + 1
                                                        : value.magnitude <= static_cast<std::uint64_t>(INT_MAX))
                                      : !value.negative;
      if (!fits)
        return OutOfRange(element, i, value.negative ? PyLong_FromLongLong(value.Signed())
                                                     : PyLong_FromUnsignedLongLong(value.magnitude)),
               false;
      if constexpr (std::is_signed_v<T>) out[static_cast<std::size_t>(i)] = static_cast<T>(value.Signed());
      else out[static_cast<std::size_t>(i)] = static_cast<T>(value.magnitude);
    }
    return true;
  }
}

// Replaces the vector's contents by `values`. A vector with an exported view keeps its storage: it
// takes values of its own size only, written in place.
template <class T>
PyObject* Commit(const Vector& v, std::vector<T>& values) {
  auto& target = *static_cast<std::vector<T>*>(v.pointer);
  if (ExportsOf(v.pointer) > 0) {
    if (values.size() != target.size()) return RefuseResize(v);
    std::copy(values.begin(), values.end(), target.begin());
  } else {
    target.swap(values);
  }
  Py_RETURN_NONE;
}

template <class T>
PyObject* FillAs(const Vector& v, const Py_buffer& buffer) {
  const Element& element = *v.element;
  Source source{static_cast<const char*>(buffer.buf), buffer.len / buffer.itemsize, buffer.itemsize,
                Letter(buffer.format)};
  std::vector<T> values;
  // Unsigned bytes are the elements' own storage, as numpy.frombuffer reads them.
  if constexpr (!std::is_same_v<T, bool>) {
    if (source.letter == 'B' && buffer.itemsize == 1) {
      if (buffer.len % element.size != 0)
        return PyErr_Format(PyExc_ValueError, "fill(): %zd bytes are not a whole number of %zd-byte elements of %s",
                            buffer.len, element.size, element.name);
      values.resize(static_cast<std::size_t>(buffer.len / element.size));
      if (buffer.len) std::memcpy(values.data(), buffer.buf, static_cast<std::size_t>(buffer.len));
      return Commit(v, values);
    }
  }
  if (!Convert(element, source, buffer.format, values)) return nullptr;
  return Commit(v, values);
}

PyObject* Fill(PyObject*, PyObject* args) {
  PyObject *object, *source;
  if (!PyArg_ParseTuple(args, "OO:fill", &object, &source)) return nullptr;
  Vector v = FindOrRaise(object, "fill", false);
  if (!v.element) return nullptr;
  if (v.element->kind == Kind::Text) return PyErr_Format(PyExc_TypeError, "fill(): a vectorss holds texts, not numbers");
  Py_buffer buffer;
  if (PyObject_GetBuffer(source, &buffer, PyBUF_C_CONTIGUOUS | PyBUF_FORMAT) < 0) return nullptr;
  PyObject* result = nullptr;
  if (buffer.itemsize <= 0) {
    PyErr_SetString(PyExc_ValueError, "fill(): the buffer has no element size");
  } else {
    switch (v.element->kind) {
      case Kind::Double: result = FillAs<double>(v, buffer); break;
      case Kind::Float: result = FillAs<float>(v, buffer); break;
      case Kind::Int: result = FillAs<int>(v, buffer); break;
      case Kind::ULL: result = FillAs<unsigned long long>(v, buffer); break;
      case Kind::Bool: result = FillAs<bool>(v, buffer); break;
      case Kind::Text: break;
    }
  }
  PyBuffer_Release(&buffer);
  return result;
}

PyMethodDef methods[] = {
    {"view", View, METH_O,
     "view(v) -> memoryview\n\nA read-write memoryview over the elements of a vectord, vectorf, vectori or vectorull\n"
     "(formats d, f, i, Q), without a copy. It keeps v alive, and v's record when v is a record field."},
    {"copy", Copy, METH_O,
     "copy(v) -> memoryview or list\n\nA copy of any vector's elements: a memoryview over a new bytearray (a vectorb's\n"
     "bits as format '?'), or a list of str for a vectorss."},
    {"fill", Fill, METH_VARARGS,
     "fill(v, buffer) -> None\n\nReplaces v's contents from a C-contiguous buffer of matching numbers in one copy.\n"
     "Unsigned bytes (bytes, bytearray) are taken as the elements' own storage. Values out of the\n"
     "element type's range raise OverflowError, a source of another kind TypeError; v is unchanged\n"
     "on failure. While a view of v is exported only a source of v's own size is taken."},
    {"exports", ExportCount, METH_O, "exports(v) -> int\n\nThe number of buffers of v's storage exported now."},
    {"guard", Guard, METH_VARARGS,
     "guard(*vectors) -> None\n\nRaises BufferError when a view of one of the vectors is exported."},
    {"exporting", Exporting, METH_NOARGS, "exporting() -> bool\n\nWhether a view of any vector is exported now."},
    {nullptr, nullptr, 0, nullptr},
};

PyModuleDef moduleDef = {PyModuleDef_HEAD_INIT, "Client3._buffers",
                         "Buffer views and bulk copies of the vectors of _Client3.", -1, methods,
                         nullptr, nullptr, nullptr, nullptr};

}  // namespace
}  // namespace client3

PyMODINIT_FUNC PyInit__buffers() {
  using namespace client3;
  ThisName();
  TypeCache();
  SwigPyPacked_type();
  SwigPyObject_type();
  exporterType.tp_name = "Client3._buffers.VectorBuffer";
  exporterType.tp_basicsize = sizeof(Exporter);
  exporterType.tp_dealloc = ExporterDealloc;
  exporterType.tp_as_buffer = &exporterBuffer;
  exporterType.tp_flags = Py_TPFLAGS_DEFAULT;
  exporterType.tp_doc = "The storage of one vector, as the buffers of its views.";
  if (PyType_Ready(&exporterType) < 0) return nullptr;
  PyObject* module = PyModule_Create(&moduleDef);
  if (!module) return nullptr;
  InitializeModule(nullptr);
  return module;
}
