// The six element types of the vectors, their spellings, and the conversion of a script object to
// a whole vector: a vector proxy of the right instance is used as it is; any other script sequence
// whose elements all convert is copied into a new vector.
#pragma once

#include <cstdio>
#include <cstring>
#include <memory>
#include <span>
#include <stdexcept>
#include <type_traits>
#include <vector>

#include "convert/scalar.h"
#include "convert/text.h"
#include "runtime/runtime.h"
#include "runtime/text.h"
#include "types/types.h"
#include "ZarvoSDKClientCPP/SafeString.h"

namespace client3 {

// The six vector classes' module functions (vectors.cpp).
std::span<const PyMethodDef> VectorFunctions();

using ZarvoSDKClientCPP::SafeString;

// Per element type: the prefix of its vector's functions, the spelling inside "std::vector< ... >" and
// the argument conversion.
template <Text Prefix, Text Name, auto Convert>
struct ElementSpelling {
  static constexpr auto prefix = Prefix;
  static constexpr auto name = Name;
  static constexpr auto convert = Convert;
};
template <class T>
struct ElementTraits;
template <>
struct ElementTraits<bool> : ElementSpelling<"vectorb", "bool", AsBool> {};
template <>
struct ElementTraits<double> : ElementSpelling<"vectord", "double", AsDouble> {};
template <>
struct ElementTraits<float> : ElementSpelling<"vectorf", "float", AsFloat> {};
template <>
struct ElementTraits<int> : ElementSpelling<"vectori", "int", AsInt> {};
template <>
struct ElementTraits<unsigned long long> : ElementSpelling<"vectorull", "unsigned long long", AsUnsignedLongLong> {};
template <>
struct ElementTraits<SafeString> : ElementSpelling<"vectorss", "ZarvoSDKClientCPP::SafeString", AsSafeString> {};

template <class T>
using ElementOf = Element<T, ElementTraits<T>::name, ElementTraits<T>::convert>;

// "std::vector< double >" and "std::vector< double,std::allocator< double > >".
template <class T>
inline constexpr auto ContainerName = cat("std::vector< ", ElementTraits<T>::name, " >");
template <class T>
inline constexpr auto AllocatorName =
    cat("std::vector< ", ElementTraits<T>::name, ",std::allocator< ", ElementTraits<T>::name, " > >");

// The name under which a sequence argument looks up its container descriptor. The bool one has a
// blank after the comma that the others lack; the lookup ignores blanks, so both find theirs.
template <class T>
inline constexpr auto SequenceName =
    cat("std::vector<", ElementTraits<T>::name, ",std::allocator< ", ElementTraits<T>::name, " > > *");
template <>
inline constexpr auto SequenceName<bool> = Text{"std::vector<bool, std::allocator< bool > > *"};

template <class T>
TypeInfo* SequenceDescriptor() {
  static TypeInfo* const type = TypeQuery(SequenceName<T>.chars);
  return type;
}

// One element of a sequence being converted; a refusal extends the pending message with the
// element's index and the refusal's text, and is thrown on.
template <class T>
T SequenceElement(PyObject* item, Py_ssize_t index) {
  try {
    return ElementOf<T>::as(item);
  } catch (const std::invalid_argument& error) {
    char where[1024];
    std::snprintf(where, sizeof where, "in sequence element %d ", static_cast<int>(index));
    if (!PyErr_Occurred()) PyErr_SetString(PyExc_TypeError, ElementTraits<T>::name.chars);
    AddErrorMsg(where);
    AddErrorMsg(error.what());
    throw;
  }
}

struct ItemRef {
  PyObject* item;
  ~ItemRef() { Py_XDECREF(item); }
};

// Lists and tuples: their items are read in place. Converting an element runs no script code, so
// the sequence cannot change under the loop. A number that does not convert is converted again by
// SequenceElement, which reports it.
template <class T>
void FillFromListOrTuple(PyObject* o, std::vector<T>& out) {
  PyObject** items = PySequence_Fast_ITEMS(o);
  Py_ssize_t size = PySequence_Fast_GET_SIZE(o);
  if constexpr (std::is_same_v<T, bool>) {
    // Packed bits: setting the true ones in a cleared vector is quicker than appending bit by bit.
    out.resize(static_cast<std::size_t>(size));
    for (Py_ssize_t i = 0; i < size; ++i) {
      bool value;
      if (ElementTraits<T>::convert(items[i], &value) < 0) value = SequenceElement<T>(items[i], i);
      if (value) out[static_cast<std::size_t>(i)] = true;
    }
    return;
  }
  out.reserve(static_cast<std::size_t>(size));
  for (Py_ssize_t i = 0; i < size; ++i) {
    if constexpr (std::is_arithmetic_v<T>) {
      T value;
      out.push_back(ElementTraits<T>::convert(items[i], &value) >= 0 ? value : SequenceElement<T>(items[i], i));
    } else {
      out.push_back(SequenceElement<T>(items[i], i));
    }
  }
}

// Any other sequence: its length is asked again before every element, so a sequence that changes
// while it is read is followed to its current end.
template <class T>
void FillFromSequence(PyObject* o, std::vector<T>& out) {
  for (Py_ssize_t i = 0;; ++i) {
    Py_ssize_t size = PySequence_Size(o);
    if (size < 0) throw std::invalid_argument("a sequence is expected");
    if (i >= size) return;
    ItemRef item{PySequence_GetItem(o, i)};
    out.push_back(SequenceElement<T>(item.item, i));
  }
}

// The standard module's arrays whose items have the element's own machine type. Reading their items
// runs no script code and gives plain numbers that convert exactly, so their memory is copied as it
// is. A subclass may read its items otherwise and is read as any other sequence.
template <class T>
bool OwnTypeCode(const char* format) {
  char code = format && format[0] && !format[1] ? format[0] : '\0';
  if constexpr (std::is_same_v<T, double>)
    return code == 'd';
  else if constexpr (std::is_same_v<T, float>)
    return code == 'f';
  else if constexpr (std::is_same_v<T, int>)
    return code == 'i' || (code == 'l' && sizeof(long) == sizeof(int));
  else if constexpr (std::is_same_v<T, unsigned long long>)
    return code == 'Q' || (code == 'L' && sizeof(unsigned long) == sizeof(T));
  else
    return false;
}

struct ArrayView {
  Py_buffer view{};
  bool held = false;
  ArrayView() = default;
  ArrayView(const ArrayView&) = delete;
  ~ArrayView() {
    if (held) PyBuffer_Release(&view);
  }
};

// True, with the array's memory held in `array`, for such an array.
template <class T>
bool OwnTypeArray(PyObject* o, ArrayView& array) {
  if constexpr (std::is_same_v<T, bool> || !std::is_arithmetic_v<T>) {
    return false;
  } else {
    if (std::strcmp(Py_TYPE(o)->tp_name, "array.array") != 0) return false;
    if (PyObject_GetBuffer(o, &array.view, PyBUF_FORMAT | PyBUF_ND) < 0) {
      PyErr_Clear();
      return false;
    }
    array.held = array.view.itemsize == sizeof(T) && OwnTypeCode<T>(array.view.format);
    if (!array.held) PyBuffer_Release(&array.view);
    return array.held;
  }
}

template <class T>
bool SequenceConverts(PyObject* o) {
  if (PyList_CheckExact(o) || PyTuple_CheckExact(o)) {
    PyObject** items = PySequence_Fast_ITEMS(o);
    for (Py_ssize_t i = 0, n = PySequence_Fast_GET_SIZE(o); i < n; ++i)
      if (!ElementOf<T>::check(items[i])) return false;
    return true;
  }
  if (ArrayView array; OwnTypeArray<T>(o, array)) return true;
  Py_ssize_t size = PySequence_Size(o);
  if (size < 0) {
    PyErr_Clear();
    return false;
  }
  for (Py_ssize_t i = 0; i < size; ++i) {
    ItemRef item{PySequence_GetItem(o, i)};
    if (!item.item) {
      PyErr_Clear();
      return false;
    }
    if (!ElementOf<T>::check(item.item)) return false;
  }
  return true;
}

// A script object as a vector. With `out` null, only tests: 0 or -1, no error left. Otherwise 0
// with the proxy's own vector (null for None), NewObjectMask with a new vector the caller deletes,
// or -1 (an element failure leaves its message pending for the caller to replace).
template <class T>
int AsVector(PyObject* o, std::vector<T>** out) {
  bool listOrTuple = PyList_CheckExact(o) || PyTuple_CheckExact(o);
  if (!listOrTuple && (o == Py_None || GetThisProxy(o))) {
    TypeInfo* type = SequenceDescriptor<T>();
    void* pointer = nullptr;
    if (!type || ConvertProxy(o, &pointer, type, 0) < 0) return ResultError;
    if (out) *out = static_cast<std::vector<T>*>(pointer);
    return ResultOk;
  }
  if (!PySequence_Check(o)) return ResultError;
  if (!out) return SequenceConverts<T>(o) ? int(ResultOk) : int(ResultError);
  auto made = std::make_unique<std::vector<T>>();
  try {
    ArrayView array;
    if (listOrTuple) {
      FillFromListOrTuple(o, *made);
    } else if (OwnTypeArray<T>(o, array)) {
      const T* items = static_cast<const T*>(array.view.buf);
      made->assign(items, items + array.view.len / array.view.itemsize);
    } else {
      FillFromSequence(o, *made);
    }
  } catch (const std::exception& error) {
    if (!PyErr_Occurred()) PyErr_SetString(PyExc_TypeError, error.what());
    return ResultError;
  }
  *out = made.release();
  return NewObjectMask;
}

// A whole-vector argument taken by const reference: a vector proxy or a sequence. A vector made for
// the call is deleted with the kind. Its messages name `Type`: the allocator spelling unless the
// function's prototype spells the parameter otherwise (the copy constructor's `std::vector< T > const &`).
template <class T, Text Type = cat(AllocatorName<T>, " const &")>
struct SequenceArg {
  static constexpr auto type = Type;
  static constexpr bool reference = true;
  std::vector<T>* value = nullptr;
  bool made = false;

  SequenceArg() = default;
  SequenceArg(const SequenceArg&) = delete;
  ~SequenceArg() {
    if (made) delete value;
  }
  int load(PyObject* o) {
    int code = AsVector<T>(o, &value);
    made = code >= 0 && (code & NewObjectMask);
    return code;
  }
  const std::vector<T>& get() const { return *value; }
  bool null() const { return !value; }
  static bool check(PyObject* o) { return AsVector<T>(o, nullptr) >= 0; }
  // Lists and tuples read the same in both modes; other sequences run script code when read.
  static bool checkFirst(PyObject* o) { return !PyList_CheckExact(o) && !PyTuple_CheckExact(o); }
};

// A whole vector taken by value: a vector made for the call is handed over rather than copied.
template <class T, Text Type>
struct SequenceValue : SequenceArg<T, Type> {
  std::vector<T> get() { return this->made ? std::move(*this->value) : *this->value; }
};

}  // namespace client3
