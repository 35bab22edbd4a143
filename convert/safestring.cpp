// The SafeString class's module functions and ToString.
#include <cstring>
#include <string>
#include <unordered_set>
#include <utility>

#include "convert/scalar.h"
#include "convert/text.h"
#include "library/ResultText.h"
#include "runtime/wrap.h"
#include "types/types.h"

namespace client3 {

using ZarvoSDKClientCPP::SafeString;

namespace {

constexpr const char* kNewSafeStringOverloads =
    "Wrong number or type of arguments for overloaded function 'new_SafeString'.\n"
    "  Possible C/C++ prototypes are:\n"
    "    ZarvoSDKClientCPP::SafeString::SafeString(char const *)\n"
    "    ZarvoSDKClientCPP::SafeString::SafeString()\n"
    "    ZarvoSDKClientCPP::SafeString::SafeString(std::string const &)\n"
    "    ZarvoSDKClientCPP::SafeString::SafeString(ZarvoSDKClientCPP::SafeString const &)\n";

// The `char const *` conversion: a str gives a heap copy of its UTF-8 (`made` is set), a
// character-pointer proxy its own text, and None a null text. A null `out` only tests.
int AsCharPtr(PyObject* o, char** out, bool* made) {
  if (PyUnicode_Check(o)) {
    PyObject* bytes = PyUnicode_AsUTF8String(o);
    if (!bytes) {
      PyErr_Clear();
      return ErrTypeError;
    }
    if (out) {
      Py_ssize_t size = PyBytes_GET_SIZE(bytes);
      *out = new char[size + 1];
      std::memcpy(*out, PyBytes_AS_STRING(bytes), size + 1);
      *made = true;
    }
    Py_DECREF(bytes);
    return ResultOk;
  }
  TypeInfo* charType = CharDescriptor();
  void* pointer = nullptr;
  if (!charType || ConvertPtr(o, &pointer, charType, 0) < 0) return ErrTypeError;
  if (out) *out = static_cast<char*>(pointer);
  return ResultOk;
}

// The `std::string const &` conversion: text as above gives a new string (None a null one); a
// proxy of a registered "std::string *" type gives that very string.
int AsStdString(PyObject* o, std::string** out) {
  char* text = nullptr;
  bool made = false;
  if (AsCharPtr(o, out ? &text : nullptr, &made) >= 0) {
    if (!out) return ResultOk;
    *out = text ? new std::string(text) : nullptr;
    if (made) delete[] text;
    return *out ? NewObjectMask : ResultOk;
  }
  TypeInfo* stringType = TypeQuery("std::string *");
  if (!stringType) return ResultError;
  void* pointer = nullptr;
  int code = ConvertPtr(o, &pointer, stringType, 0);
  if (code >= 0 && out) *out = static_cast<std::string*>(pointer);
  return code;
}

PyObject* NewOwned(SafeString* text) {
  return NewPointerObj(nullptr, text, TypeFor<SafeString>(), PointerOwn | PointerNoShadow);
}

// Makes a SafeString that views `text`. The view never owns its storage, and releasing it would leave
// the new string pointing at freed memory, so the text is kept for the life of the process: each
// distinct text once, which bounds what a script that makes strings in a loop can pin. The set is
// never destroyed, so a view stays readable while the interpreter shuts down; its nodes never move.
PyObject* NewView(const char* text) {
  static auto* kept = new std::unordered_set<std::string>();
  return NewOwned(new SafeString(kept->emplace(text).first->c_str()));
}

PyObject* NewSafeString(PyObject*, PyObject* args) {
  PyObject* argv[1];
  Py_ssize_t argc = UnpackTuple(args, "new_SafeString", 0, 1, argv);
  if (argc == 1) return NewOwned(new SafeString());
  if (argc == 2) {
    void* pointer = nullptr;
    if (ConvertPtr(argv[0], &pointer, TypeFor<SafeString>(), PointerNoNull) >= 0 && pointer) {
      // The copy form: its argument goes through the text conversion, which takes only str and
      // bytes, so a SafeString proxy ends here with "Expected string type".
      String source;
      if (source.load(argv[0]) < 0) return nullptr;
      return NewOwned(new SafeString(source.get()));
    }
    if (AsStdString(argv[0], nullptr) >= 0) {
      std::string* text = nullptr;
      int code = AsStdString(argv[0], &text);
      if (code < 0) {
        PyErr_SetString(ErrorType(ArgError(code)), "in method 'new_SafeString', argument 1 of type 'std::string const &'");
        return nullptr;
      }
      if (!text) {
        PyErr_SetString(PyExc_ValueError,
                        "invalid null reference in method 'new_SafeString', argument 1 of type 'std::string const &'");
        return nullptr;
      }
      PyObject* result = NewView(text->c_str());
      if (code & NewObjectMask) delete text;
      return result;
    }
    // The `char const *` form takes nothing that the `std::string` form refuses, so it is never
    // the one chosen.
  }
  RaiseOrModifyTypeError(kNewSafeStringOverloads);
  return nullptr;
}

constexpr auto IsEmpty = [](const SafeString* s) { return !s->Text() || !*s->Text(); };
constexpr auto Value = [](const SafeString* s) { return SafeStringText(*s); };
// The messages are the library's constant texts: each is made into a str once and then shared.
constexpr auto Message = [](ZarvoSDKClientCPP::ResultCode::Enum code) {
  const char* message = ZarvoSDKClientCPP::ResultText(code);
  static std::pair<const char*, PyObject*> made[16];
  for (auto& [text, object] : made) {
    if (text == message) {
      Py_INCREF(object);
      return object;
    }
    if (!text) {
      object = TextToPython(message, std::strlen(message));
      if (!object) return object;
      text = message;
      Py_INCREF(object);
      return object;
    }
  }
  return TextToPython(message, std::strlen(message));
};

using ResultCodeArg = EnumKind<ZarvoSDKClientCPP::ResultCode::Enum, "ZarvoSDKClientCPP::ResultCode::Enum">;

using Functions = Table<
    Raw<"new_SafeString", Tuple, NewSafeString>,
    Fn<"delete_SafeString", Object, Delete<SafeString>, Disowned<SafeString>>,
    Fn<"SafeString_IsEmpty", Object, IsEmpty, ConstSelf<SafeString>>,
    Fn<"SafeString_Value", Object, Value, ConstSelf<SafeString>>,
    Fn<"SafeString___str__", Object, Value, ConstSelf<SafeString>>,
    Fn<"SafeString___repr__", Object, Value, ConstSelf<SafeString>>,
    Register<"SafeString", p_SafeString>,
    Init<"SafeString">,
    Fn<"ToString", Object, Message, ResultCodeArg>>;

}  // namespace

std::span<const PyMethodDef> SafeStringFunctions() { return Functions::defs; }

}  // namespace client3
