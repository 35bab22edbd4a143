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

// How a form's argument fared when the form was tried.
enum class Tried { Refused, Selected, Loaded };

// Kinds tested by their exact type are tested before they are converted, and before the other kinds,
// so that a form they rule out converts nothing.
template <class K>
inline constexpr bool TypeTested = requires { K::typeTested; };

// Tries one argument of a form: converted at once when it converts (the conversion is then the one
// the call uses), or else tested with the kind's own check, if it has one. An argument that does not
// convert but passes its check still selects the form; it reports its failure when the form is called.
// A kind whose reading runs script code (a sequence of the script's own) is checked first and read
// again by the call, as the form is chosen by the check. No error is left behind.
template <class K>
Tried Try(K& kind, PyObject* o) {
  if constexpr (requires { K::checkFirst(o); }) {
    if (K::checkFirst(o)) return K::check(o) ? Tried::Selected : Tried::Refused;
  }
  if constexpr (TypeTested<K>) {
    if (!K::check(o)) return Tried::Refused;
  }
  if (kind.load(o) >= 0) return Tried::Loaded;
  PyErr_Clear();
  if constexpr (requires { K::check(o); }) {
    if (K::check(o)) return Tried::Selected;
  }
  return Tried::Refused;
}

// Reports an argument of the chosen form: one that did not convert is converted again for its message;
// a null reference is refused.
template <Text Name, unsigned N, class K>
bool Report(K& kind, PyObject* o, Tried tried) {
  if (tried != Tried::Loaded) return Load<Name, N>(kind, o);
  if constexpr (K::reference) {
    if (kind.null()) {
      RaiseNullRef(NullRefText<Name, N, K::type>());
      return false;
    }
  }
  return true;
}

// One form of an overloaded function: its argument kinds and its target.
template <auto Target, class... K>
struct Form {
  static constexpr std::size_t arity = sizeof...(K);

  // Calls the form when its arguments fit it, each argument converted once; false when they do not.
  template <Text Name>
  static bool attempt(PyObject** objects, PyObject*& result) {
    return attempt<Name>(objects, result, std::index_sequence_for<K...>{});
  }
  template <Text Name, std::size_t... I>
  static bool attempt(PyObject** objects, PyObject*& result, std::index_sequence<I...>) {
    std::tuple<K...> kinds;
    Tried tried[arity ? arity : 1];
    [[maybe_unused]] auto fits = [&](auto index) {
      constexpr std::size_t J = decltype(index)::value;
      tried[J] = Try(std::get<J>(kinds), objects[J]);
      return tried[J] != Tried::Refused;
    };
    if (!((!TypeTested<K> || fits(std::integral_constant<std::size_t, I>{})) && ...)) return false;
    if (!((TypeTested<K> || fits(std::integral_constant<std::size_t, I>{})) && ...)) return false;
    result = (Report<Name, I + 1>(std::get<I>(kinds), objects[I], tried[I]) && ...)
                 ? CallGuarded<Target, UnexpectedErrors>(std::get<I>(kinds).get()...)
                 : nullptr;
    return true;
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
    bool chosen = ((Forms::arity == count && Forms::template attempt<Name>(objects, result)) || ...);
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
