// A second module of the family, built only for the test suite: the same runtime and descriptor table as
// _Client3, joining the shared type ring at import, with functions that look inside its copy of the runtime
// (ring, descriptors, cast lists, pointer conversion both ways, type cache, packed values, text conversion).
#include <cstring>

#include "convert/text.h"
#include "runtime/runtime.h"
#include "types/types.h"
#include "runtime/wrap.h"

namespace client3 {
namespace {

using ZarvoSDKClientCPP::SafeString;

PyObject* Address(const void* pointer) { return PyLong_FromVoidPtr(const_cast<void*>(pointer)); }
PyObject* NewRef(PyObject* object) { return Py_XINCREF(object), object; }

// Appends `item` (a new reference, or null after a failure) to `list`; on failure releases the list.
void Append(PyObject*& list, PyObject* item) {
  if (!item || PyList_Append(list, item) < 0) Py_CLEAR(list);
  Py_XDECREF(item);
}

// The descriptor of a mangled name anywhere in the ring; None selects no descriptor at all.
bool RingType(PyObject* name, TypeInfo** out) {
  *out = nullptr;
  if (name == Py_None) return true;
  const char* text = PyUnicode_AsUTF8(name);
  if (!text) return false;
  ModuleInfo* head = GetModule();
  *out = head ? TypeQueryMangled(head, head, text) : nullptr;
  if (!*out) PyErr_Format(PyExc_LookupError, "no descriptor %s", text);
  return *out != nullptr;
}

// Addresses of the records in the ring, from its head.
PyObject* Ring(PyObject*, PyObject*) {
  PyObject* list = PyList_New(0);
  ModuleInfo* head = GetModule();
  for (ModuleInfo* module = head; list && module; module = module->next == head ? nullptr : module->next)
    Append(list, Address(module));
  return list;
}

PyObject* OwnModule(PyObject*, PyObject*) { return Address(&thisModule); }

// The mangled names of a descriptor's accepted source types, in list order.
PyObject* Casts(PyObject*, PyObject* name) {
  TypeInfo* type;
  if (!RingType(name, &type)) return nullptr;
  PyObject* list = PyList_New(0);
  for (CastInfo* cast = type ? type->casts : nullptr; list && cast; cast = cast->next)
    Append(list, PyUnicode_FromString(cast->type->mangledName));
  return list;
}

// (descriptor found from the ring head's own table, the one this module uses, this module's static
// one) for a mangled name.
PyObject* Descriptor(PyObject*, PyObject* name) {
  const char* text = PyUnicode_AsUTF8(name);
  if (!text) return nullptr;
  ModuleInfo* head = GetModule();
  TypeInfo* fromHead = head ? TypeQueryMangled(head, head->next, text) : nullptr;
  TypeInfo* used = TypeQueryMangled(&thisModule, thisModule.next, text);
  TypeInfo* initial = nullptr;
  for (std::size_t i = 0; i < thisModule.size; ++i)
    if (std::strcmp(thisModule.typeInitial[i]->mangledName, text) == 0) initial = thisModule.typeInitial[i];
  return Py_BuildValue("(NNN)", Address(fromHead), Address(used), Address(initial));
}

// The address of the descriptor that an object's proxy carries, or None.
PyObject* ProxyType(PyObject*, PyObject* object) {
  SwigPyObject* proxy = GetThisProxy(object);
  return proxy ? Address(proxy->type) : NewRef(Py_None);
}

// make(mangled name or None, address, flags): NewPointerObj.
PyObject* Make(PyObject*, PyObject* args) {
  PyObject *name, *address;
  int flags;
  if (!PyArg_ParseTuple(args, "OOi", &name, &address, &flags)) return nullptr;
  TypeInfo* type;
  if (!RingType(name, &type)) return nullptr;
  void* pointer = PyLong_AsVoidPtr(address);
  return PyErr_Occurred() ? nullptr : NewPointerObj(nullptr, pointer, type, flags);
}

// convert(object, mangled name or None, flags[, outputs]) -> (code, address or None, own):
// ConvertPtr; with `outputs` false the conversion is asked for its code only.
PyObject* Convert(PyObject*, PyObject* args) {
  PyObject *object, *name;
  int flags, outputs = 1;
  if (!PyArg_ParseTuple(args, "OOi|p", &object, &name, &flags, &outputs)) return nullptr;
  TypeInfo* type;
  if (!RingType(name, &type)) return nullptr;
  void* pointer = nullptr;
  int own = 0;
  int code = outputs ? ConvertPtr(object, &pointer, type, flags, &own) : ConvertPtr(object, nullptr, type, flags);
  return Py_BuildValue("(iNi)", code, code >= 0 && pointer ? Address(pointer) : NewRef(Py_None), own);
}

// The mangled name TypeQuery finds for a text, or None.
PyObject* Query(PyObject*, PyObject* text) {
  const char* chars = PyUnicode_AsUTF8(text);
  TypeInfo* type = chars ? TypeQuery(chars) : nullptr;
  return type ? PyUnicode_FromString(type->mangledName) : chars ? NewRef(Py_None) : nullptr;
}

PyObject* Cache(PyObject*, PyObject*) { return NewRef(TypeCache()); }

// packed(bytes, mangled name): a SwigPyPacked holding a copy of the bytes.
PyObject* Packed(PyObject*, PyObject* args) {
  Py_buffer data;
  PyObject* name;
  if (!PyArg_ParseTuple(args, "y*O", &data, &name)) return nullptr;
  TypeInfo* type;
  PyObject* result = RingType(name, &type) ? SwigPyPacked_New(data.buf, data.len, type) : nullptr;
  PyBuffer_Release(&data);
  return result;
}

// The mangled names of this module's static descriptor table, in table order.
PyObject* Names(PyObject*, PyObject*) {
  PyObject* list = PyList_New(0);
  for (std::size_t i = 0; list && i < thisModule.size; ++i)
    Append(list, PyUnicode_FromString(thisModule.typeInitial[i]->mangledName));
  return list;
}

// What the library side receives from a `SafeString const &` argument: its bytes, or None when the
// text is null or empty.
constexpr auto Received = [](const SafeString& text) -> PyObject* {
  const char* chars = text.Text();
  return chars && *chars ? PyBytes_FromString(chars) : NewRef(Py_None);
};

// A library-made string (owned through the factory) holding the given text, returned by value.
constexpr auto LibraryText = [](const SafeString& text) {
  return SafeString(ZarvoSDKClientCPP::VStringFactory::Instance(), text.Text() ? text.Text() : "");
};

// A zero-filled record of the type with the given mangled name, owned by its proxy, as the library
// would hand one out (most records can only come from the library).
PyObject* Record(PyObject*, PyObject* name) {
  TypeInfo* type;
  if (!RingType(name, &type)) return nullptr;
  using namespace ZarvoSDKClientCPP;
#define CLIENT3_MAKE_RECORD(record) \
  if (type == Type(p_##record)) return NewPointerObj(nullptr, new record(), type, PointerOwn);
  CLIENT3_DERIVED_RECORDS(CLIENT3_MAKE_RECORD)
  CLIENT3_MAKE_RECORD(Output_Result)
#undef CLIENT3_MAKE_RECORD
  PyErr_SetString(PyExc_LookupError, "not a record");
  return nullptr;
}

// Appends a parameter with library-owned texts to a parameter vector.
constexpr auto PushParameter = [](std::vector<ZarvoSDKClientCPP::Type_Parameter>* parameters,
                                  const SafeString& name, const SafeString& value) {
  auto& factory = ZarvoSDKClientCPP::VStringFactory::Instance();
  parameters->push_back({SafeString(factory, name.Text() ? name.Text() : ""),
                         SafeString(factory, value.Text() ? value.Text() : "")});
};
using ParameterVector =
    Pointer<std::vector<ZarvoSDKClientCPP::Type_Parameter>,
            "std::vector< ZarvoSDKClientCPP::Type_Parameter,std::allocator< ZarvoSDKClientCPP::Type_Parameter > > &">;

using Functions = Table<
    Raw<"ring", NoArgs, Ring>, Raw<"own_module", NoArgs, OwnModule>, Raw<"casts", Object, Casts>,
    Raw<"descriptor", Object, Descriptor>, Raw<"proxy_type", Object, ProxyType>, Raw<"make", Tuple, Make>,
    Raw<"convert", Tuple, Convert>, Raw<"query", Object, Query>, Raw<"cache", NoArgs, Cache>,
    Raw<"packed", Tuple, Packed>, Raw<"names", NoArgs, Names>, Fn<"echo", Object, Received, String>,
    Fn<"library_text", Object, LibraryText, String>, Raw<"record", Object, Record>,
    Fn<"push_parameter", Tuple, PushParameter, ParameterVector, String, String>>;

PyMethodDef methods[Functions::defs.size() + 1];

PyModuleDef moduleDef = {PyModuleDef_HEAD_INIT, "_Client3Peer", nullptr, -1, methods, nullptr, nullptr, nullptr, nullptr};

}  // namespace
}  // namespace client3

// The same start-up steps as _Client3: runtime singletons, module, then the ring.
PyMODINIT_FUNC PyInit__Client3Peer() {
  using namespace client3;
  ThisName();
  TypeCache();
  SwigPyPacked_type();
  SwigPyObject_type();
  std::copy(Functions::defs.begin(), Functions::defs.end(), methods);
  PyObject* module = PyModule_Create2(&moduleDef, 1013);
  if (!module) return nullptr;
  InitializeModule(nullptr);
  return module;
}
