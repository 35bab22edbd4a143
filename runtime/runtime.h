// The binding runtime: proxy objects, type descriptors and the ring that modules of the same family
// share, pointer conversion in both directions, argument unpacking and error reporting.
//
// The record layouts here are shared through the capsule with every module of the family; they
// must stay the same in all of them.
#pragma once

#define PY_SSIZE_T_CLEAN
#include <Python.h>

#include <cstddef>

namespace client3 {

// ---- Type descriptors -------------------------------------------------------------------------

struct TypeInfo;
struct ClientData;

using ConverterFunc = void* (*)(void* pointer, int* newMemory);
using DynamicCastFunc = TypeInfo* (*)(void** pointer);

struct CastInfo {
  TypeInfo* type;           // the source type whose proxies are accepted
  ConverterFunc converter;  // up-cast from the source; null means identity
  CastInfo* next;
  CastInfo* prev;
};

struct TypeInfo {
  const char* mangledName;
  const char* prettyNames;  // readable spellings separated by '|', the last one shown
  DynamicCastFunc dynamicCast;
  CastInfo* casts;
  ClientData* clientData;
  int ownsClientData;
};

struct ModuleInfo {
  TypeInfo** types;  // one slot per descriptor plus a null terminator
  std::size_t size;
  ModuleInfo* next;  // the ring link
  TypeInfo** typeInitial;
  CastInfo** castInitial;
  void* clientData;
};

struct ClientData {
  PyObject* proxyClass;
  PyObject* newRaw;
  PyObject* newArgs;
  PyObject* destroy;
  int destroyTakesTuple;
  int implicitConvBusy;
  PyTypeObject* builtinType;
};

// The module that links this copy of the runtime provides its record.
extern ModuleInfo thisModule;

// The descriptor in use for a type: this module's own, or the one another module of the family
// registered first.
inline TypeInfo* Type(int id) { return thisModule.types[id]; }

// The index of each native C++ type's descriptor in the module's table; the module's list of types
// gives them (-1: no descriptor).
template <class T>
inline constexpr int TypeOf = -1;

template <class T>
inline TypeInfo* TypeFor() {
  static_assert(TypeOf<T> >= 0, "no descriptor for this type");
  return Type(TypeOf<T>);
}

// ---- Proxy objects ----------------------------------------------------------------------------

struct SwigPyObject {
  PyObject_HEAD
  void* ptr;
  TypeInfo* type;
  int own;
  PyObject* next;
};

struct SwigPyPacked {
  PyObject_HEAD
  void* pack;
  TypeInfo* type;
  std::size_t size;
};

PyTypeObject* SwigPyObject_type();
// The proxy type of this copy of the runtime once it is ready; null before.
extern PyTypeObject* proxyType;
PyTypeObject* SwigPyPacked_type();
bool SwigPyObject_Check(PyObject* op);
bool SwigPyPacked_Check(PyObject* op);
PyObject* SwigPyObject_append(PyObject* proxy, PyObject* other);
// Lowercase hexadecimal of the bytes, first byte first, high nibble first; returns the end.
char* PackHex(char* out, const void* data, std::size_t size);
PyObject* SwigPyPacked_New(void* data, std::size_t size, TypeInfo* type);

// ---- Flags and results ------------------------------------------------------------------------

enum : int {
  PointerDisown = 1,
  PointerImplicitConv = 2,
  PointerNoNull = 4,
};
enum : int {
  PointerOwn = 1,
  PointerNoShadow = 2,
  PointerInitInPlace = 4,
};
enum : int {
  ResultOk = 0,
  NewObjectMask = 512,
  CastNewMemory = 2,
};

// A conversion result meaning that the converter has set its own exception already.
inline constexpr int Raised = -0x7fffffff - 1;

enum ErrorCode : int {
  ResultError = -1,
  ErrIOError = -2,
  ErrRuntimeError = -3,
  ErrIndexError = -4,
  ErrTypeError = -5,
  ErrDivisionByZero = -6,
  ErrOverflowError = -7,
  ErrSyntaxError = -8,
  ErrValueError = -9,
  ErrSystemError = -10,
  ErrAttributeError = -11,
  ErrMemoryError = -12,
  ErrNullReference = -13,
};

// ---- Registry ---------------------------------------------------------------------------------

PyObject* ThisName();
PyObject* ContainerOwnerAttribute();
PyObject* TypeCache();

void InitializeModule(void* clientData);
ModuleInfo* GetModule();
TypeInfo* TypeQueryMangled(ModuleInfo* start, ModuleInfo* end, const char* name);
TypeInfo* TypeQuery(const char* name);
CastInfo* TypeCheck(const char* name, TypeInfo* target);
const char* PrettyTypeName(const TypeInfo* type);
SwigPyObject* GetThisProxy(PyObject* object);
int ConvertPtr(PyObject* object, void** out, TypeInfo* target, int flags, int* own = nullptr);
// ConvertPtr with its common case inline: a bare proxy of this runtime that holds the target type.
inline int ConvertProxy(PyObject* object, void** out, TypeInfo* target, int flags) {
  if (object && target && Py_TYPE(object) == proxyType) {
    auto* proxy = reinterpret_cast<SwigPyObject*>(object);
    if (proxy->type == target) {
      *out = proxy->ptr;
      if (flags & PointerDisown) proxy->own = 0;
      return ResultOk;
    }
  }
  return ConvertPtr(object, out, target, flags);
}
PyObject* NewPointerObj(PyObject* self, void* ptr, TypeInfo* type, int flags);
ClientData* NewClientData(PyObject* proxyClass);
void SetTypeClientData(TypeInfo* type, ClientData* data);
PyObject* ExceptionType(TypeInfo* type);

// ---- Unpacking and errors ---------------------------------------------------------------------

Py_ssize_t UnpackTuple(PyObject* args, const char* name, Py_ssize_t min, Py_ssize_t max, PyObject** objs);
PyObject* ErrorType(int code);
inline int ArgError(int code) { return code == ResultError ? ErrTypeError : code; }
void AddErrorMsg(const char* message);
void SetErrorObj(PyObject* type, PyObject* value);
void RaiseOrModifyTypeError(const char* message);

// The shared class registration entry points; `type` is the class's descriptor.
PyObject* RegisterClass(PyObject* args, TypeInfo* type);
PyObject* InitShadowInstance(PyObject* args);

}  // namespace client3
