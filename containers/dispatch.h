// Table lines for the container and iterator families: their targets run `Guarded` (runtime/wrap.h)
// by translations of the native exceptions they signal with, and overloaded functions choose their
// form by testing each argument without converting it.
#pragma once

#include <algorithm>
#include <cstddef>
#include <functional>
#include <stdexcept>
#include <type_traits>
#include <utility>

#include "convert/scalar.h"
#include "convert/text.h"
#include "runtime/runtime.h"
#include "runtime/text.h"
#include "runtime/wrap.h"

namespace client3 {

// Thrown by a target that has set its script exception already.
struct Pending {};

// Containers: out-of-range becomes IndexError, invalid-argument ValueError, with their texts.
inline void ContainerErrors() {
  try {
    throw;
  } catch (const std::out_of_range& error) {
    PyErr_SetString(PyExc_IndexError, error.what());
  } catch (const std::invalid_argument& error) {
    PyErr_SetString(PyExc_ValueError, error.what());
  } catch (const Pending&) {
  }
}

// ---- Overload dispatch ------------------------------------------------------------------------

// Tests one argument for a kind without converting it and without leaving an error.
template <class K>
bool Accepts(PyObject* o) {
  if constexpr (requires { K::check(o); }) {
    return K::check(o);
  } else {
    K kind;
    int code = kind.load(o);
    if (code == Raised) PyErr_Clear();
    return code >= 0;
  }
}

// One form of an overloaded function: its argument kinds and its target.
template <auto Target, class... K>
struct Form {
  static constexpr std::size_t arity = sizeof...(K);

  static bool accepts(PyObject** objects) { return accepts(objects, std::index_sequence_for<K...>{}); }
  template <std::size_t... I>
  static bool accepts(PyObject** objects, std::index_sequence<I...>) {
    return (Accepts<K>(objects[I]) && ...);
  }
  template <Text Name>
  static PyObject* call(PyObject** objects) {
    return Invoke<Name, Target, K...>(objects, std::index_sequence_for<K...>{});
  }
};

// What an overloaded function does when no form fits: raise the prototype list, or (for the
// two-operand operators) return NotImplemented so that the reflected operation may be tried.
enum class NoMatch { Raise, NotImplemented };

template <Text Name, Text Message, NoMatch Otherwise, class... Forms>
PyObject* Dispatch(PyObject*, PyObject* args) {
  constexpr std::size_t most = std::max({Forms::arity...});
  PyObject* objects[most];
  if (Py_ssize_t found = UnpackTuple(args, Name.chars, 0, most, objects)) {
    std::size_t count = static_cast<std::size_t>(found - 1);
    PyObject* result = nullptr;
    bool chosen = ((Forms::arity == count && Forms::accepts(objects) &&
                    (result = Forms::template call<Name>(objects), true)) ||
                   ...);
    if (chosen) return result;
  }
  if constexpr (Otherwise == NoMatch::NotImplemented) {
    PyErr_Clear();
    Py_RETURN_NOTIMPLEMENTED;
  } else {
    RaiseOrModifyTypeError(Message.chars);
    return nullptr;
  }
}

template <Text Name, Text Message, class... Forms>
struct Overloaded {
  static constexpr std::array<PyMethodDef, 1> defs{
      {{Name.chars, Dispatch<Name, Message, NoMatch::Raise, Forms...>, METH_VARARGS, nullptr}}};
};

// A two-operand operator: arguments that do not convert give NotImplemented.
template <Text Name, class... Forms>
struct OperatorLine {
  static constexpr std::array<PyMethodDef, 1> defs{
      {{Name.chars, Dispatch<Name, Text{""}, NoMatch::NotImplemented, Forms...>, METH_VARARGS, nullptr}}};
};

// "Wrong number or type of arguments ..." with one line per prototype.
template <Text Name, Text... Prototypes>
inline constexpr auto OverloadMessage = cat("Wrong number or type of arguments for overloaded function '", Name,
                                            "'.\n  Possible C/C++ prototypes are:\n", cat("    ", Prototypes, "\n")...);

}  // namespace client3
