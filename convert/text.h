// Text between script strings and the library's SafeString. Text goes into the library as UTF-8
// (str, strictly encoded) or as the bytes given; it comes out decoded from UTF-8 with
// "surrogateescape", so bytes that are not UTF-8 survive the round trip.
#pragma once

#include <cstring>
#include <span>
#include <string>

#include "runtime/runtime.h"
#include "runtime/text.h"
#include "ZarvoSDKClientCPP/SafeString.h"

namespace client3 {

// The SafeString class's module functions and ToString (safestring.cpp).
std::span<const PyMethodDef> SafeStringFunctions();

// The character-pointer descriptor, looked up once.
inline TypeInfo* CharDescriptor() {
  static TypeInfo* const type = TypeQuery("_p_char");
  return type;
}

// Text of the given length as str; a text too long for the library's 32-bit lengths comes back as
// a character-pointer proxy.
inline PyObject* TextToPython(const char* data, std::size_t length) {
  if (!data) Py_RETURN_NONE;
  if (length >= 0x80000000u) return NewPointerObj(nullptr, const_cast<char*>(data), CharDescriptor(), 0);
  return PyUnicode_DecodeUTF8(data, static_cast<Py_ssize_t>(length), "surrogateescape");
}

inline PyObject* ToPython(const std::string& text) { return TextToPython(text.data(), text.size()); }

// The text of a SafeString up to its first NUL; a null text is the empty string.
inline PyObject* SafeStringText(const ZarvoSDKClientCPP::SafeString& text) {
  const char* chars = text.Text();
  if (!chars) chars = "";
  return TextToPython(chars, std::strlen(chars));
}

// A str or bytes as an owning SafeString (its text duplicated through the library's factory, so
// the copy never refers to a script object's buffer). With no destination the object is only
// tested. A str that cannot be encoded leaves its encoding error pending and gives Raised.
inline int AsSafeString(PyObject* o, ZarvoSDKClientCPP::SafeString* out) {
  const char* text;
  if (PyUnicode_Check(o)) {
    if (!out) return ResultOk;
    text = PyUnicode_AsUTF8AndSize(o, nullptr);  // the text ends at an embedded NUL
    if (!text) return Raised;
  } else if (PyBytes_Check(o)) {
    if (!out) return ResultOk;
    text = PyBytes_AS_STRING(o);
  } else {
    return ErrTypeError;
  }
  *out = ZarvoSDKClientCPP::SafeString(ZarvoSDKClientCPP::VStringFactory::Instance(), text);
  return ResultOk;
}

// A `SafeString const &` argument: a view, valid for the one call, on the UTF-8 of a str or on the
// bytes of a bytes object, ending at the first NUL. Anything else is refused with
// "Expected string type". A str that cannot be encoded does not stop the call: its encoding error
// stays pending and the library receives an empty string.
struct String {
  static constexpr Text type = "ZarvoSDKClientCPP::SafeString const &";
  static constexpr bool reference = false;
  ZarvoSDKClientCPP::SafeString value;

  int load(PyObject* o) {
    if (PyUnicode_Check(o)) {
      // The UTF-8 form is kept by the str object itself, so nothing is copied.
      if (const char* utf8 = PyUnicode_AsUTF8AndSize(o, nullptr)) value.ViewText = utf8;
      return ResultOk;
    }
    if (PyBytes_Check(o)) {
      value.ViewText = PyBytes_AS_STRING(o);
      return ResultOk;
    }
    PyErr_SetString(PyExc_TypeError, "Expected string type");
    return Raised;
  }
  const ZarvoSDKClientCPP::SafeString& get() const { return value; }
};

}  // namespace client3
