/* The floor of the benchmark suite: extension functions that do nothing but take their arguments in
 * the module's calling conventions (one object, or a tuple of 1 to 8), and C loops that read a list,
 * tuple or other sequence of numbers into a native buffer. Built by suite.py with the interpreter's
 * own compiler settings; `_c3floor_empty` (the same source with FLOOR_EMPTY) has no functions at all
 * and measures the import of an empty extension. */
#define PY_SSIZE_T_CLEAN
#include <Python.h>

#include <stdlib.h>
#include <string.h>

#ifdef FLOOR_EMPTY

static struct PyModuleDef empty = {PyModuleDef_HEAD_INIT, "_c3floor_empty", NULL, -1, NULL, NULL, NULL, NULL, NULL};
PyMODINIT_FUNC PyInit__c3floor_empty(void) { return PyModule_Create(&empty); }

#else

static PyObject* one(PyObject* self, PyObject* arg) {
  (void)self;
  (void)arg;
  Py_RETURN_NONE;
}

#define TUPLE_FLOOR(n)                                                       \
  static PyObject* t##n(PyObject* self, PyObject* args) {                    \
    (void)self;                                                              \
    if (PyTuple_GET_SIZE(args) != n) {                                       \
      PyErr_Format(PyExc_TypeError, "t" #n " expected %d arguments", n);     \
      return NULL;                                                           \
    }                                                                        \
    Py_RETURN_NONE;                                                          \
  }
TUPLE_FLOOR(1)
TUPLE_FLOOR(2)
TUPLE_FLOOR(3)
TUPLE_FLOOR(4)
TUPLE_FLOOR(5)
TUPLE_FLOOR(6)
TUPLE_FLOOR(7)
TUPLE_FLOOR(8)

/* One element into its native slot; 0 on success. */
static int read_double(PyObject* o, void* out) {
  double v = PyFloat_Check(o) ? PyFloat_AS_DOUBLE(o) : PyLong_AsDouble(o);
  if (v == -1.0 && PyErr_Occurred()) return -1;
  *(double*)out = v;
  return 0;
}
static int read_float(PyObject* o, void* out) {
  double v;
  if (read_double(o, &v) < 0) return -1;
  *(float*)out = (float)v;
  return 0;
}
static int read_int(PyObject* o, void* out) {
  long v = PyLong_AsLong(o);
  if (v == -1 && PyErr_Occurred()) return -1;
  *(int*)out = (int)v;
  return 0;
}
static int read_ull(PyObject* o, void* out) {
  unsigned long long v = PyLong_AsUnsignedLongLong(o);
  if (v == (unsigned long long)-1 && PyErr_Occurred()) return -1;
  *(unsigned long long*)out = v;
  return 0;
}
static int read_bool(PyObject* o, void* out) {
  if (!PyBool_Check(o)) {
    PyErr_SetString(PyExc_TypeError, "bool");
    return -1;
  }
  *(unsigned char*)out = o == Py_True;
  return 0;
}

/* Reads every element of `source` into a fresh buffer of `size`-byte slots, which is then freed:
 * the cost of the conversion loop plus the first touch of the new memory. */
static PyObject* fill(PyObject* source, size_t size, int (*read)(PyObject*, void*)) {
  Py_ssize_t n = PySequence_Size(source);
  if (n < 0) return NULL;
  char* buffer = malloc(n ? (size_t)n * size : 1);
  if (!buffer) return PyErr_NoMemory();
  int failed = 0;
  if (PyList_CheckExact(source) || PyTuple_CheckExact(source)) {
    PyObject** items = PySequence_Fast_ITEMS(source);
    for (Py_ssize_t i = 0; i < n && !failed; ++i) failed = read(items[i], buffer + (size_t)i * size);
  } else {
    for (Py_ssize_t i = 0; i < n && !failed; ++i) {
      PyObject* item = PySequence_GetItem(source, i);
      failed = !item || read(item, buffer + (size_t)i * size);
      Py_XDECREF(item);
    }
  }
  free(buffer);
  if (failed) return NULL;
  Py_RETURN_NONE;
}

static PyObject* fill_d(PyObject* self, PyObject* o) { (void)self; return fill(o, sizeof(double), read_double); }
static PyObject* fill_f(PyObject* self, PyObject* o) { (void)self; return fill(o, sizeof(float), read_float); }
static PyObject* fill_i(PyObject* self, PyObject* o) { (void)self; return fill(o, sizeof(int), read_int); }
static PyObject* fill_Q(PyObject* self, PyObject* o) { (void)self; return fill(o, sizeof(unsigned long long), read_ull); }
static PyObject* fill_b(PyObject* self, PyObject* o) { (void)self; return fill(o, 1, read_bool); }

/* The first touch alone: a fresh buffer of the given number of bytes, written once and freed. */
static PyObject* touch(PyObject* self, PyObject* o) {
  (void)self;
  Py_ssize_t n = PyLong_AsSsize_t(o);
  if (n < 0) return PyErr_Occurred() ? NULL : PyErr_Format(PyExc_ValueError, "negative size");
  char* buffer = malloc(n ? (size_t)n : 1);
  if (!buffer) return PyErr_NoMemory();
  memset(buffer, 1, (size_t)n);
  int first = buffer[0];
  free(buffer);
  return PyLong_FromLong(first);
}

static PyMethodDef methods[] = {
    {"one", one, METH_O, NULL},
    {"t1", t1, METH_VARARGS, NULL},
    {"t2", t2, METH_VARARGS, NULL},
    {"t3", t3, METH_VARARGS, NULL},
    {"t4", t4, METH_VARARGS, NULL},
    {"t5", t5, METH_VARARGS, NULL},
    {"t6", t6, METH_VARARGS, NULL},
    {"t7", t7, METH_VARARGS, NULL},
    {"t8", t8, METH_VARARGS, NULL},
    {"fill_d", fill_d, METH_O, NULL},
    {"fill_f", fill_f, METH_O, NULL},
    {"fill_i", fill_i, METH_O, NULL},
    {"fill_Q", fill_Q, METH_O, NULL},
    {"fill_b", fill_b, METH_O, NULL},
    {"touch", touch, METH_O, NULL},
    {NULL, NULL, 0, NULL},
};

static struct PyModuleDef floor_module = {PyModuleDef_HEAD_INIT, "_c3floor", NULL, -1, methods, NULL, NULL, NULL, NULL};
PyMODINIT_FUNC PyInit__c3floor(void) { return PyModule_Create(&floor_module); }

#endif
