// The function table. Every module function is one table line naming the function, its calling
// convention, the kinds of its arguments and its target; this header turns such lines into method
// table entries. A kind converts one script argument:
//
//   struct Kind {
//     static constexpr Text type = "...";   // the declared type named in its failure message
//     static constexpr bool reference;      // a null result raises "invalid null reference ..."
//     int load(PyObject*);                  // >= 0 success; < 0 an ErrorCode; Raised: already set
//     auto get();                           // what the target receives
//     bool null() const;                    // only needed when `reference` is true
//   };
//
// The "in method 'F', argument N of type 'T'" texts are made at compile time from the line.
#pragma once

#include <algorithm>
#include <array>
#include <climits>
#include <cstddef>
#include <exception>
#include <functional>
#include <new>
#include <span>
#include <tuple>
#include <type_traits>
#include <utility>

#include "runtime/runtime.h"
#include "runtime/text.h"

namespace client3 {

enum Convention : int { Tuple = METH_VARARGS, Object = METH_O, NoArgs = METH_NOARGS };

// "invalid null reference in method 'F', argument N of type 'T'"; the plain message is its tail.
inline constexpr std::size_t kNullPrefix = sizeof("invalid null reference ") - 1;
template <Text Name, unsigned N, Text Type>
inline constexpr auto ArgMessage =
    cat("invalid null reference in method '", Name, "', argument ", decimal<N>(), " of type '", Type, "'");

template <Text Name, unsigned N, Text Type>
constexpr const char* ArgText() {
  return ArgMessage<Name, N, Type>.chars + kNullPrefix;
}
template <Text Name, unsigned N, Text Type>
constexpr const char* NullRefText() {
  return ArgMessage<Name, N, Type>.chars;
}

// Sets the exception for a failed argument conversion.
[[gnu::cold]] inline void RaiseArg(int code, const char* message) {
  if (code != Raised) PyErr_SetString(ErrorType(ArgError(code)), message);
}
[[gnu::cold]] inline void RaiseNullRef(const char* message) { PyErr_SetString(PyExc_ValueError, message); }

template <Text Name, unsigned N, class K>
inline bool Load(K& kind, PyObject* object) {
  int code = kind.load(object);
  if (code < 0) {
    RaiseArg(code, ArgText<Name, N, K::type>());
    return false;
  }
  if constexpr (K::reference) {
    if (kind.null()) {
      RaiseNullRef(NullRefText<Name, N, K::type>());
      return false;
    }
  }
  return true;
}

// ---- Pointer kinds ----------------------------------------------------------------------------

enum class Null { Refuse, Allow };

// A pointer argument converted to T's descriptor. A null pointer (None) is refused with the
// "invalid null reference" ValueError unless the target takes null.
template <class T, Text Type, Null Nulls = Null::Refuse, int Flags = 0>
struct Pointer {
  static constexpr auto type = Type;
  static constexpr bool reference = Nulls == Null::Refuse;
  T* value = nullptr;
  int load(PyObject* o) {
    void* pointer = nullptr;
    int code = ConvertProxy(o, &pointer, TypeFor<std::remove_const_t<T>>(), Flags);
    value = static_cast<T*>(pointer);
    return code;
  }
  T* get() const { return value; }
  bool null() const { return !value; }
};

// The object of a member function, `T *` or `T const *`.
template <class T>
using Self = Pointer<T, cat(NameOf<T>, " *")>;
template <class T>
using ConstSelf = Pointer<const T, cat(NameOf<T>, " const *")>;
// The object of a destructor: ownership moves to the native side; None is accepted and ignored.
template <class T>
using Disowned = Pointer<T, cat(NameOf<T>, " *"), Null::Allow, PointerDisown>;

// "delete_X": destroys what the proxy pointed to.
template <class T>
inline constexpr auto Delete = [](T* object) { delete object; };

// ---- Results ----------------------------------------------------------------------------------

// What a target returns becomes a script object through ToPython: the numbers and booleans here, the
// wrapped classes below; a family whose targets return other types converts them itself.
inline PyObject* ToPython(int v) { return PyLong_FromLong(v); }
inline PyObject* ToPython(unsigned int v) { return PyLong_FromSize_t(v); }
inline PyObject* ToPython(bool v) { return PyBool_FromLong(v); }
inline PyObject* ToPython(float v) { return PyFloat_FromDouble(v); }
inline PyObject* ToPython(double v) { return PyFloat_FromDouble(v); }
inline PyObject* ToPython(unsigned long long v) {
  return v < 0x80000000ULL ? PyLong_FromLong(static_cast<long>(v)) : PyLong_FromUnsignedLongLong(v);
}

// A pointer into an object that someone else keeps: handed out as a non-owning proxy.
template <class T>
struct Borrowed {
  T* pointer;
};

// A new heap object handed out as an owning proxy, with the given NewPointerObj flags.
template <class T, int Flags = PointerOwn>
struct Owned {
  T* pointer;
};

template <class T>
PyObject* ToPython(Borrowed<T> value) {
  return NewPointerObj(nullptr, value.pointer, TypeFor<std::remove_const_t<T>>(), 0);
}
template <class T, int Flags>
PyObject* ToPython(Owned<T, Flags> value) {
  return NewPointerObj(nullptr, value.pointer, TypeFor<T>(), Flags);
}
inline PyObject* ToPython(PyObject* value) { return value; }

// A record or string returned by value: a heap copy owned by its proxy.
template <class T>
  requires(TypeOf<T> >= 0)
PyObject* ToPython(const T& value) {
  return ToPython(Owned<T>{new T(value)});
}
// A record returned by a call is moved to the heap rather than copied: its vectors change owner
// without being allocated and filled a second time.
template <class T>
  requires(TypeOf<T> >= 0 && !std::is_reference_v<T>)
PyObject* ToPython(T&& value) {
  return ToPython(Owned<T>{new T(std::move(value))});
}

// The last resort for native exceptions that a target lets escape: they become the nearest
// interpreter exception rather than being let through the interpreter's frames.
inline void UnexpectedErrors() {
  try {
    throw;
  } catch (const std::bad_alloc&) {
    PyErr_NoMemory();
  } catch (const std::exception& error) {
    PyErr_SetString(PyExc_RuntimeError, error.what());
  }
}

// Calls Target and converts what it returns. An exception it throws is handed to Translate, which
// runs inside the handler, sets the script exception for the ones it knows and rethrows the rest.
template <auto Target, auto Translate, class... A>
PyObject* CallGuarded(A&&... args) {
  try {
    using R = std::invoke_result_t<decltype(Target), A...>;
    if constexpr (std::is_void_v<R>) {
      std::invoke(Target, std::forward<A>(args)...);
      Py_RETURN_NONE;
    } else {
      return ToPython(std::invoke(Target, std::forward<A>(args)...));
    }
  } catch (...) {
    Translate();
    return nullptr;
  }
}

// A target whose own exceptions are translated by Translate (families that signal errors natively).
template <auto Target, auto Translate>
inline constexpr auto Guarded = [](auto&&... args) -> PyObject* {
  return CallGuarded<Target, Translate>(std::forward<decltype(args)>(args)...);
};

// ---- Wrappers ---------------------------------------------------------------------------------

template <Text Name, auto Target, class... K, std::size_t... I>
PyObject* Invoke(PyObject** objects, std::index_sequence<I...>) {
  std::tuple<K...> kinds;
  if (!(Load<Name, I + 1>(std::get<I>(kinds), objects[I]) && ...)) return nullptr;
  return CallGuarded<Target, UnexpectedErrors>(std::get<I>(kinds).get()...);
}

template <Text Name, Convention Conv, auto Target, class... K>
PyObject* Wrap(PyObject*, PyObject* args) {
  constexpr Py_ssize_t count = sizeof...(K);
  PyObject* objects[count ? count : 1];
  if constexpr (Conv == Object) {
    static_assert(count == 1, "a one-object function takes exactly one argument");
    if (!args) return nullptr;
    objects[0] = args;
  } else {
    static_assert(Conv == Tuple || count == 0, "a no-argument function takes none");
    if (Conv == Tuple && args && PyTuple_CheckExact(args) && PyTuple_GET_SIZE(args) == count) {
      for (Py_ssize_t i = 0; i < count; ++i) objects[i] = PyTuple_GET_ITEM(args, i);
    } else if (!UnpackTuple(args, Name.chars, count, count, objects)) {
      return nullptr;
    }
  }
  return Invoke<Name, Target, K...>(objects, std::index_sequence_for<K...>{});
}

// ---- Table lines ------------------------------------------------------------------------------

// A function whose arguments are converted by kinds K and passed to Target.
template <Text Name, Convention Conv, auto Target, class... K>
struct Fn {
  static constexpr std::array<PyMethodDef, 1> defs{{{Name.chars, Wrap<Name, Conv, Target, K...>, Conv, nullptr}}};
};

// A function with a body of its own (overload dispatchers and the like).
template <Text Name, Convention Conv, PyCFunction Body>
struct Raw {
  static constexpr std::array<PyMethodDef, 1> defs{{{Name.chars, Body, Conv, nullptr}}};
};

template <int Id>
PyObject* RegisterWrapper(PyObject*, PyObject* args) {
  return RegisterClass(args, Type(Id));
}
inline PyObject* InitWrapper(PyObject*, PyObject* args) { return InitShadowInstance(args); }

// "<Class>_swigregister" and "<Class>_swiginit".
template <Text Class, int Id>
struct Register {
  static constexpr std::array<PyMethodDef, 1> defs{
      {{chars<cat(Class, "_swigregister")>, RegisterWrapper<Id>, METH_O, nullptr}}};
};
template <Text Class>
struct Init {
  static constexpr std::array<PyMethodDef, 1> defs{{{chars<cat(Class, "_swiginit")>, InitWrapper, METH_VARARGS, nullptr}}};
};

template <std::size_t... N>
constexpr auto Join(const std::array<PyMethodDef, N>&... parts) {
  std::array<PyMethodDef, (N + ... + 0)> out{};
  std::size_t k = 0;
  ((std::copy(parts.begin(), parts.end(), out.begin() + k), k += N), ...);
  return out;
}

// A run of table lines, in order.
template <class... Lines>
struct Table {
  static constexpr auto defs = Join(Lines::defs...);
};

}  // namespace client3
