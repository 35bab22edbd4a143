// Argument unpacking, error codes and the texts that scripts see when a call goes wrong.
#include "runtime/runtime.h"

namespace client3 {

Py_ssize_t UnpackTuple(PyObject* args, const char* name, Py_ssize_t min, Py_ssize_t max, PyObject** objs) {
  if (!args) {
    if (!min && !max) return 1;
    PyErr_Format(PyExc_TypeError, "%s expected %s%d arguments, got none", name, min == max ? "" : "at least ",
                 static_cast<int>(min));
    return 0;
  }
  if (!PyTuple_Check(args)) {
    if (min <= 1 && max >= 1) {
      objs[0] = args;
      for (Py_ssize_t i = 1; i < max; ++i) objs[i] = nullptr;
      return 2;
    }
    PyErr_SetString(PyExc_SystemError, "UnpackTuple() argument list is not a tuple");
    return 0;
  }
  Py_ssize_t n = PyTuple_GET_SIZE(args);
  if (n < min) {
    PyErr_Format(PyExc_TypeError, "%s expected %s%d arguments, got %d", name, min == max ? "" : "at least ",
                 static_cast<int>(min), static_cast<int>(n));
    return 0;
  }
  if (n > max) {
    PyErr_Format(PyExc_TypeError, "%s expected %s%d arguments, got %d", name, min == max ? "" : "at most ",
                 static_cast<int>(max), static_cast<int>(n));
    return 0;
  }
  for (Py_ssize_t i = 0; i < n; ++i) objs[i] = PyTuple_GET_ITEM(args, i);
  for (Py_ssize_t i = n; i < max; ++i) objs[i] = nullptr;
  return n + 1;
}

PyObject* ErrorType(int code) {
  switch (code) {
    case ErrMemoryError: return PyExc_MemoryError;
    case ErrIOError: return PyExc_IOError;
    case ErrRuntimeError: return PyExc_RuntimeError;
    case ErrIndexError: return PyExc_IndexError;
    case ErrTypeError: return PyExc_TypeError;
    case ErrDivisionByZero: return PyExc_ZeroDivisionError;
    case ErrOverflowError: return PyExc_OverflowError;
    case ErrSyntaxError: return PyExc_SyntaxError;
    case ErrValueError: return PyExc_ValueError;
    case ErrSystemError: return PyExc_SystemError;
    case ErrAttributeError: return PyExc_AttributeError;
    default: return PyExc_RuntimeError;
  }
}

void AddErrorMsg(const char* message) {
  if (!PyErr_Occurred()) {
    PyErr_SetString(PyExc_RuntimeError, message);
    return;
  }
  PyObject *type, *value, *trace;
  PyErr_Fetch(&type, &value, &trace);
  // An old value without text leaves the message alone, and so does one whose text is empty (an
  // exception class raised with no arguments: older interpreters hand it over as the class alone,
  // newer ones as an instance); a text that cannot be read as UTF-8 is named as such.
  PyObject* old = value ? PyObject_Str(value) : nullptr;
  const char* oldText = old ? PyUnicode_AsUTF8(old) : nullptr;
  PyErr_Clear();
  if (old && (!oldText || *oldText))
    PyErr_Format(type, "%s %s", oldText ? oldText : "Invalid error message", message);
  else
    PyErr_Format(type, "%s", message);
  Py_XDECREF(old);
  Py_XDECREF(type);
  Py_XDECREF(value);
  Py_XDECREF(trace);
}

void SetErrorObj(PyObject* type, PyObject* value) {
  PyErr_SetObject(type, value);
  Py_XDECREF(value);
}

void RaiseOrModifyTypeError(const char* message) {
  if (PyErr_Occurred() && PyErr_GivenExceptionMatches(PyErr_Occurred(), PyExc_TypeError)) {
    PyObject *type, *value, *trace;
    PyErr_Fetch(&type, &value, &trace);
    PyObject* text = PyUnicode_FromFormat("%S\nAdditional information:\n%s", value, message);
    if (text) {
      Py_XDECREF(value);
      PyErr_Restore(type, text, trace);
    } else {
      Py_XDECREF(type);
      Py_XDECREF(value);
      Py_XDECREF(trace);
    }
  } else {
    PyErr_SetString(PyExc_TypeError, message);
  }
}

PyObject* RegisterClass(PyObject* args, TypeInfo* type) {
  PyObject* cls;
  if (!UnpackTuple(args, "swigregister", 1, 1, &cls)) return nullptr;
  SetTypeClientData(type, NewClientData(cls));
  Py_RETURN_NONE;
}

PyObject* InitShadowInstance(PyObject* args) {
  PyObject* objs[2];
  if (!UnpackTuple(args, "swiginit", 2, 2, objs)) return nullptr;
  if (SwigPyObject* proxy = GetThisProxy(objs[0])) {
    // A refused append leaves its TypeError pending; the call still answers None.
    Py_XDECREF(SwigPyObject_append(reinterpret_cast<PyObject*>(proxy), objs[1]));
  } else if (PyObject* dict = PyObject_GetAttrString(objs[0], "__dict__")) {
    PyDict_SetItem(dict, ThisName(), objs[1]);
    Py_DECREF(dict);
  }
  Py_RETURN_NONE;
}

}  // namespace client3
