// Scalar conversion between script objects and the library's scalar types. The library was built
// for a platform whose int and long are 32 bits wide, so the integer ranges are checked explicitly.
// Argument conversions return 0 or an ErrorCode and never leave an interpreter error pending.
#pragma once

#include <cfloat>
#include <climits>
#include <cmath>
#include <stdexcept>
#include <type_traits>

#include "runtime/runtime.h"
#include "runtime/text.h"

namespace client3 {

inline bool IsInt(PyObject* o) { return PyLong_Check(o); }

inline int AsInt(PyObject* o, int* out) {
  if (!IsInt(o)) return ErrTypeError;
  long v = PyLong_AsLong(o);
  if (PyErr_Occurred() || v < INT_MIN || v > INT_MAX) {
    PyErr_Clear();
    return ErrOverflowError;
  }
  if (out) *out = static_cast<int>(v);
  return ResultOk;
}

inline int AsUnsignedInt(PyObject* o, unsigned int* out) {
  if (!IsInt(o)) return ErrTypeError;
  unsigned long v = PyLong_AsUnsignedLong(o);
  if (PyErr_Occurred() || v > UINT_MAX) {
    PyErr_Clear();
    return ErrOverflowError;
  }
  if (out) *out = static_cast<unsigned int>(v);
  return ResultOk;
}

inline int AsUnsignedLongLong(PyObject* o, unsigned long long* out) {
  if (!IsInt(o)) return ErrTypeError;
  unsigned long long v = PyLong_AsUnsignedLongLong(o);
  if (PyErr_Occurred()) {
    PyErr_Clear();
    return ErrOverflowError;
  }
  if (out) *out = v;
  return ResultOk;
}

inline int AsBool(PyObject* o, bool* out) {
  if (Py_TYPE(o) != &PyBool_Type) return ErrTypeError;
  if (out) *out = o == Py_True;
  return ResultOk;
}

inline int AsDouble(PyObject* o, double* out) {
  if (Py_TYPE(o) == &PyFloat_Type || PyType_IsSubtype(Py_TYPE(o), &PyFloat_Type)) {
    if (out) *out = PyFloat_AS_DOUBLE(o);
    return ResultOk;
  }
  if (!IsInt(o)) return ErrTypeError;
  double v = PyLong_AsDouble(o);
  if (PyErr_Occurred()) {
    // An integer beyond the double range is a type error here, not an overflow.
    PyErr_Clear();
    return ErrTypeError;
  }
  if (out) *out = v;
  return ResultOk;
}

inline int AsFloat(PyObject* o, float* out) {
  double v;
  int code = AsDouble(o, &v);
  if (code < 0) return code;
  if (std::isfinite(v) && (v < -FLT_MAX || v > FLT_MAX)) return ErrOverflowError;
  if (out) *out = static_cast<float>(v);
  return ResultOk;
}

// ---- Kinds ------------------------------------------------------------------------------------

template <class T, Text Type, int (*Convert)(PyObject*, T*)>
struct ScalarKind {
  static constexpr auto type = Type;
  static constexpr bool reference = false;
  T value{};
  int load(PyObject* o) { return Convert(o, &value); }
  T get() const { return value; }
};

using Int = ScalarKind<int, "int", AsInt>;
using UnsignedInt = ScalarKind<unsigned int, "unsigned int", AsUnsignedInt>;
using UnsignedLongLong = ScalarKind<unsigned long long, "unsigned long long", AsUnsignedLongLong>;
using Bool = ScalarKind<bool, "bool", AsBool>;
using Float = ScalarKind<float, "float", AsFloat>;
using Double = ScalarKind<double, "double", AsDouble>;

// An enumeration read as an int. Every int must be a value of E, which only a fixed underlying type
// of int guarantees (only such an enumeration can be list-initialised from an int).
template <class E, Text Type>
struct EnumKind {
  static_assert(std::is_same_v<std::underlying_type_t<E>, int> && requires(int v) { E{v}; },
                "the enumeration needs int as its fixed underlying type");
  static constexpr auto type = Type;
  static constexpr bool reference = false;
  int value = 0;
  int load(PyObject* o) { return AsInt(o, &value); }
  E get() const { return static_cast<E>(value); }
};

// ---- Sequence elements ------------------------------------------------------------------------

// The conversion of one element of a script sequence: on refusal it sets TypeError with the bare
// type name (unless an error is already pending) and throws.
template <class T, Text Name, int (*Convert)(PyObject*, T*)>
struct Element {
  static constexpr auto name = Name;
  static bool check(PyObject* o) { return Convert(o, nullptr) >= 0; }
  static T as(PyObject* o) {
    T value{};
    if (!o || Convert(o, &value) < 0) {
      if (!PyErr_Occurred()) PyErr_SetString(PyExc_TypeError, Name.chars);
      throw std::invalid_argument("bad type");
    }
    return value;
  }
};

}  // namespace client3
