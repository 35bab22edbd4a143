// The type registry: descriptors joined into the process-wide ring through the capsule, lookups by
// mangled and readable name, and pointer conversion in both directions.
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "runtime/runtime.h"

namespace client3 {

namespace {

constexpr const char* kCapsuleName = "swig_runtime_data4.type_pointer_capsulePelluxPostSDKClientPython3";
constexpr const char* kRuntimeModule = "swig_runtime_data4";
constexpr const char* kCapsuleAttribute = "type_pointer_capsulePelluxPostSDKClientPython3";

PyObject* thisName = nullptr;
ModuleInfo* ringHead = nullptr;  // the capsule pointer cache

void DestroyModule(PyObject* capsule) {
  auto* module = static_cast<ModuleInfo*>(PyCapsule_GetPointer(capsule, kCapsuleName));
  if (!module) {
    PyErr_Clear();
  } else {
    for (std::size_t i = 0; i < module->size; ++i) {
      TypeInfo* type = module->types[i];
      ClientData* data = type ? type->clientData : nullptr;
      if (type && type->ownsClientData && data) {
        Py_XDECREF(data->newRaw);
        Py_XDECREF(data->newArgs);
        Py_XDECREF(data->destroy);
      }
    }
  }
  Py_DECREF(ThisName());
  thisName = nullptr;
}

void LinkCast(TypeInfo* type, CastInfo* cast) {
  cast->prev = nullptr;
  cast->next = type->casts;
  if (type->casts) type->casts->prev = cast;
  type->casts = cast;
}

// Equality of two spellings that ignores blanks on both sides.
bool SameIgnoringBlanks(const char* a, const char* aEnd, const char* b) {
  for (;;) {
    while (a != aEnd && *a == ' ') ++a;
    while (*b == ' ') ++b;
    if (a == aEnd || !*b) return a == aEnd && !*b;
    if (*a++ != *b++) return false;
  }
}

bool PrettyNameMatches(const TypeInfo* type, const char* name) {
  const char* spelling = type->prettyNames;
  if (!spelling) return false;
  for (;;) {
    const char* bar = std::strchr(spelling, '|');
    const char* end = bar ? bar : spelling + std::strlen(spelling);
    if (SameIgnoringBlanks(spelling, end, name)) return true;
    if (!bar) return false;
    spelling = bar + 1;
  }
}

}  // namespace

PyObject* ThisName() {
  if (!thisName) thisName = PyUnicode_FromString("this");
  return thisName;
}

PyObject* ContainerOwnerAttribute() {
  static PyObject* name = PyUnicode_FromString("__swig_container");
  return name;
}

PyObject* TypeCache() {
  static PyObject* cache = PyDict_New();
  return cache;
}

ModuleInfo* GetModule() {
  if (!ringHead) {
    ringHead = static_cast<ModuleInfo*>(PyCapsule_Import(kCapsuleName, 0));
    if (PyErr_Occurred()) {
      PyErr_Clear();
      ringHead = nullptr;
    }
  }
  return ringHead;
}

void InitializeModule(void* clientData) {
  ModuleInfo* self = &thisModule;
  bool firstTime = false;
  if (!self->next) {
    self->next = self;
    firstTime = true;
  }
  self->clientData = clientData;

  ModuleInfo* head = GetModule();
  if (!head) {
    PyObject* capsule = PyCapsule_New(self, kCapsuleName, DestroyModule);
    PyObject* runtime = PyImport_AddModule(kRuntimeModule);
    if (capsule && runtime && PyModule_AddObject(runtime, kCapsuleAttribute, capsule) == 0) {
      ringHead = self;
    } else {
      Py_XDECREF(capsule);
      PyErr_Clear();
    }
  } else {
    ModuleInfo* walk = head;
    do {
      if (walk == self) return;
      walk = walk->next;
    } while (walk != head);
    self->next = head->next;
    head->next = self;
  }
  if (!firstTime) return;

  bool others = self->next != self;
  for (std::size_t i = 0; i < self->size; ++i) {
    TypeInfo* own = self->typeInitial[i];
    TypeInfo* used = own;
    if (others) {
      if (TypeInfo* found = TypeQueryMangled(self->next, self, own->mangledName)) {
        if (own->clientData) found->clientData = own->clientData;
        used = found;
      }
    }
    for (CastInfo* cast = self->castInitial[i]; cast->type; ++cast) {
      if (others) {
        if (TypeInfo* source = TypeQueryMangled(self->next, self, cast->type->mangledName)) {
          if (used == own)
            cast->type = source;
          else if (TypeCheck(source->mangledName, used))
            continue;
        }
      }
      LinkCast(used, cast);
    }
    self->types[i] = used;
  }
  self->types[self->size] = nullptr;
}

TypeInfo* TypeQueryMangled(ModuleInfo* start, ModuleInfo* end, const char* name) {
  ModuleInfo* module = start;
  do {
    std::size_t low = 0, high = module->size;
    while (low < high) {
      std::size_t middle = low + (high - low) / 2;
      const char* probe = module->types[middle] ? module->types[middle]->mangledName : nullptr;
      if (!probe) break;
      int order = std::strcmp(name, probe);
      if (order == 0) return module->types[middle];
      if (order < 0)
        high = middle;
      else
        low = middle + 1;
    }
    module = module->next;
  } while (module != end);
  return nullptr;
}

TypeInfo* TypeQuery(const char* name) {
  PyObject* key = PyUnicode_FromString(name);
  if (!key) {
    PyErr_Clear();
    return nullptr;
  }
  TypeInfo* type = nullptr;
  if (PyObject* cached = PyDict_GetItem(TypeCache(), key)) {
    type = static_cast<TypeInfo*>(PyCapsule_GetPointer(cached, nullptr));
  } else if (ModuleInfo* head = GetModule()) {
    type = TypeQueryMangled(head, head, name);
    if (!type) {
      ModuleInfo* module = head;
      do {
        for (std::size_t i = 0; i < module->size && !type; ++i)
          if (module->types[i] && PrettyNameMatches(module->types[i], name)) type = module->types[i];
        module = module->next;
      } while (!type && module != head);
    }
    if (type) {
      PyObject* capsule = PyCapsule_New(type, nullptr, nullptr);
      if (capsule) {
        PyDict_SetItem(TypeCache(), key, capsule);
        Py_DECREF(capsule);
      }
    }
  }
  Py_DECREF(key);
  return type;
}

CastInfo* TypeCheck(const char* name, TypeInfo* target) {
  if (!target) return nullptr;
  for (CastInfo* cast = target->casts; cast; cast = cast->next) {
    if (cast->type->mangledName != name && std::strcmp(cast->type->mangledName, name) != 0) continue;
    if (cast != target->casts) {
      cast->prev->next = cast->next;
      if (cast->next) cast->next->prev = cast->prev;
      cast->next = target->casts;
      cast->prev = nullptr;
      target->casts->prev = cast;
      target->casts = cast;
    }
    return cast;
  }
  return nullptr;
}

const char* PrettyTypeName(const TypeInfo* type) {
  if (!type) return nullptr;
  if (!type->prettyNames) return type->mangledName;
  const char* last = std::strrchr(type->prettyNames, '|');
  return last ? last + 1 : type->prettyNames;
}

SwigPyObject* GetThisProxy(PyObject* object) {
  // A chain of "this" attributes that does not end in a proxy within this many steps is taken to
  // loop back on itself (an object whose "this" is itself, say) and holds no proxy.
  constexpr int kLongestChain = 64;
  // Numbers, texts and None are built-in objects that can carry no attribute of their own.
  if (object && (PyLong_CheckExact(object) || PyFloat_CheckExact(object) || PyUnicode_CheckExact(object) ||
                 PyBool_Check(object) || PyBytes_CheckExact(object) || object == Py_None))
    return nullptr;
  for (int depth = 0; object && depth < kLongestChain; ++depth) {
    if (SwigPyObject_Check(object)) return reinterpret_cast<SwigPyObject*>(object);
    PyObject* next = PyObject_GetAttr(object, ThisName());
    if (!next) {
      PyErr_Clear();
      return nullptr;
    }
    // The owner keeps its "this" alive. One that nobody else holds (made afresh by a property, say)
    // would be gone once released, so it does not count as a proxy the object carries.
    bool kept = Py_REFCNT(next) > 1;
    Py_DECREF(next);
    if (!kept) return nullptr;
    object = next;
  }
  return nullptr;
}

int ConvertPtr(PyObject* object, void** out, TypeInfo* target, int flags, int* own) {
  if (!object) return ResultError;
  if (object == Py_None && !(flags & PointerImplicitConv)) {
    if (out) *out = nullptr;
    return (flags & PointerNoNull) ? int(ErrNullReference) : int(ResultOk);
  }
  SwigPyObject* proxy = GetThisProxy(object);
  if (own) *own = 0;
  // A chain that loops (`append` can make one) ends when the walk meets a proxy that moves along
  // the chain at half its pace.
  SwigPyObject* behind = proxy;
  bool stepBehind = false;
  for (; proxy; proxy = reinterpret_cast<SwigPyObject*>(proxy->next)) {
    void* pointer = proxy->ptr;
    bool accepted = false, updateOwn = true;
    if (!target || proxy->type == target) {
      if (out) *out = pointer;
      accepted = true;
    } else if (CastInfo* cast = proxy->type ? TypeCheck(proxy->type->mangledName, target) : nullptr) {
      int newMemory = 0;
      if (out) *out = cast->converter ? cast->converter(pointer, &newMemory) : pointer;
      if (newMemory == CastNewMemory) {
        if (own)
          *own |= CastNewMemory;
        else
          updateOwn = false;
      }
      accepted = true;
    }
    if (accepted) {
      if (own && updateOwn) *own |= proxy->own;
      if (flags & PointerDisown) proxy->own = 0;
      return ResultOk;
    }
    if (!proxy->next || !SwigPyObject_Check(proxy->next)) break;
    if (stepBehind) behind = reinterpret_cast<SwigPyObject*>(behind->next);
    stepBehind = !stepBehind;
    if (proxy->next == reinterpret_cast<PyObject*>(behind)) break;
  }

  int result = ResultError;
  if (flags & PointerImplicitConv) {
    ClientData* data = target ? target->clientData : nullptr;
    if (data && data->proxyClass && !data->implicitConvBusy) {
      data->implicitConvBusy = 1;
      PyObject* made = PyObject_CallFunctionObjArgs(data->proxyClass, object, nullptr);
      data->implicitConvBusy = 0;
      if (PyErr_Occurred()) {
        PyErr_Clear();
      } else if (made) {
        if (SwigPyObject* madeProxy = GetThisProxy(made)) {
          void* pointer = nullptr;
          result = ConvertPtr(reinterpret_cast<PyObject*>(madeProxy), &pointer, target, 0);
          if (result >= 0 && out) {
            *out = pointer;
            madeProxy->own = 0;  // the caller owns the new object now
            result |= NewObjectMask;
          }
        }
      }
      Py_XDECREF(made);
    }
    if (result < 0 && object == Py_None) {
      if (out) *out = nullptr;
      PyErr_Clear();
      return ResultOk;
    }
  }
  return result;
}

PyObject* NewPointerObj(PyObject* self, void* ptr, TypeInfo* type, int flags) {
  if (!ptr) Py_RETURN_NONE;
  ClientData* data = type ? type->clientData : nullptr;
  if (data && data->builtinType) {
    // Built-in proxy classes are not used by this family; the branch keeps the shared contract.
    SwigPyObject* made = nullptr;
    if ((flags & PointerInitInPlace) && self) {
      made = reinterpret_cast<SwigPyObject*>(self);
      if (made->ptr) {
        SwigPyObject* fresh = PyObject_New(SwigPyObject, data->builtinType);
        if (!fresh) Py_RETURN_NONE;
        SwigPyObject* last = made;
        while (last->next) last = reinterpret_cast<SwigPyObject*>(last->next);
        last->next = reinterpret_cast<PyObject*>(fresh);
        made = fresh;
      } else {
        Py_INCREF(self);
      }
    } else {
      made = PyObject_New(SwigPyObject, data->builtinType);
      if (!made) Py_RETURN_NONE;
    }
    made->ptr = ptr;
    made->type = type;
    made->own = flags & PointerOwn;
    made->next = nullptr;
    return reinterpret_cast<PyObject*>(made);
  }

  SwigPyObject* proxy = PyObject_New(SwigPyObject, SwigPyObject_type());
  if (!proxy) return nullptr;
  proxy->ptr = ptr;
  proxy->type = type;
  proxy->own = flags & PointerOwn;
  proxy->next = nullptr;
  PyObject* bare = reinterpret_cast<PyObject*>(proxy);
  if (!data || (flags & PointerNoShadow)) return bare;

  PyObject* instance = nullptr;
  if (data->newRaw) {
    instance = PyObject_Call(data->newRaw, data->newArgs, nullptr);
    if (instance && PyObject_SetAttr(instance, ThisName(), bare) < 0) Py_CLEAR(instance);
  } else {
    auto* cls = reinterpret_cast<PyTypeObject*>(data->newArgs);
    if (!cls->tp_new) {
      PyErr_Format(PyExc_TypeError, "cannot create '%s' instances", cls->tp_name);
    } else {
      // No keywords: creation slots take a null dictionary as an empty one, so none is allocated.
      PyObject* emptyArgs = PyTuple_New(0);
      if (emptyArgs) instance = cls->tp_new(cls, emptyArgs, nullptr);
      Py_XDECREF(emptyArgs);
    }
    if (instance) {
      if (PyObject_SetAttr(instance, ThisName(), bare) < 0)
        Py_CLEAR(instance);
      else
        PyType_Modified(Py_TYPE(instance));  // refresh the interpreter's attribute cache
    }
  }
  Py_DECREF(bare);
  return instance;
}

ClientData* NewClientData(PyObject* proxyClass) {
  if (!proxyClass) return nullptr;
  auto* data = static_cast<ClientData*>(std::malloc(sizeof(ClientData)));
  data->proxyClass = proxyClass;
  Py_INCREF(proxyClass);
  if (PyObject_IsInstance(proxyClass, reinterpret_cast<PyObject*>(&PyType_Type)) == 1) {
    data->newRaw = nullptr;
    data->newArgs = proxyClass;
    Py_INCREF(proxyClass);
  } else {
    PyErr_Clear();
    data->newRaw = PyObject_GetAttrString(proxyClass, "__new__");
    if (data->newRaw) {
      data->newArgs = PyTuple_Pack(1, proxyClass);
    } else {
      PyErr_Clear();
      data->newArgs = proxyClass;
      Py_INCREF(proxyClass);
    }
  }
  data->destroy = PyObject_GetAttrString(proxyClass, "__swig_destroy__");
  data->destroyTakesTuple = 0;
  if (!data->destroy) {
    PyErr_Clear();
  } else {
    // Only a built-in function can be called directly with the dying proxy; anything else is
    // called through the interpreter with a temporary proxy.
    data->destroyTakesTuple = !PyCFunction_Check(data->destroy) || !(PyCFunction_GET_FLAGS(data->destroy) & METH_O);
  }
  data->implicitConvBusy = 0;
  data->builtinType = nullptr;
  return data;
}

void SetTypeClientData(TypeInfo* type, ClientData* data) {
  type->clientData = data;
  for (CastInfo* cast = type->casts; cast; cast = cast->next)
    if (!cast->converter && !cast->type->clientData) SetTypeClientData(cast->type, data);
  type->ownsClientData = 1;
}

PyObject* ExceptionType(TypeInfo* type) {
  ClientData* data = type ? type->clientData : nullptr;
  return data && data->proxyClass ? data->proxyClass : PyExc_RuntimeError;
}

}  // namespace client3
