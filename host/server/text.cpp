#include "host/server/text.h"

#include <charconv>
#include <cstdint>
#include <type_traits>
#include <vector>

#include "host/scene/values.h"

namespace client3::host {

using protocol::Reader;
using protocol::Type;
using protocol::Writer;

namespace {

template <class T>
void AppendNumber(std::string& out, T value) {
  char buffer[64];
  auto [end, error] = std::to_chars(buffer, buffer + sizeof buffer, value);
  out.append(buffer, error == std::errc() ? end : buffer);
}

void AppendEscaped(std::string& out, std::string_view text) {
  for (char c : text) {
    if (c == ',' || c == '\\' || c == '=') out += '\\';
    out += c;
  }
}

// One scalar of the given type read from the payload and appended as text.
void AppendScalar(std::string& out, Reader& in, Type type) {
  switch (type) {
    case Type::Int: AppendNumber(out, in.Raw<std::int32_t>()); break;
    case Type::UInt: AppendNumber(out, in.Raw<std::uint32_t>()); break;
    case Type::ULong: AppendNumber(out, in.Raw<std::uint64_t>()); break;
    case Type::Float: AppendNumber(out, in.Raw<float>()); break;
    case Type::Double: AppendNumber(out, in.Raw<double>()); break;
    case Type::Bool: out += in.Raw<std::uint8_t>() ? "true" : "false"; break;
    default: AppendEscaped(out, in.RawText()); break;
  }
}

// One scalar parsed from text and written without its tag.
template <class T>
bool WriteParsed(std::optional<T> value, Writer& out) {
  if (value) out.Raw(static_cast<std::conditional_t<std::is_same_v<T, bool>, std::uint8_t, T>>(*value));
  return value.has_value();
}

bool WriteScalar(std::string_view text, Type type, Writer& out) {
  switch (type) {
    case Type::Int: return WriteParsed(ParseNumber<std::int32_t>(text), out);
    case Type::UInt: return WriteParsed(ParseNumber<std::uint32_t>(text), out);
    case Type::ULong: return WriteParsed(ParseNumber<std::uint64_t>(text), out);
    case Type::Float: return WriteParsed(ParseNumber<float>(text), out);
    case Type::Double: return WriteParsed(ParseNumber<double>(text), out);
    case Type::Bool: return WriteParsed(ParseBool(text), out);
    default: out.RawText(text); return true;
  }
}

}  // namespace

std::string ToText(Reader& in, Type type) {
  std::string out;
  in.Expect(type);
  if (type == Type::String) {
    out = in.RawText();
  } else if (type == Type::Params) {
    for (std::uint32_t i = 0, n = in.Raw<std::uint32_t>(); i < n; ++i) {
      if (i) out += ',';
      AppendEscaped(out, in.RawText());
      out += '=';
      AppendEscaped(out, in.RawText());
    }
  } else if (Type element = protocol::ElementType(type); element != type) {
    for (std::uint32_t i = 0, n = in.Raw<std::uint32_t>(); i < n; ++i) {
      if (i) out += ',';
      AppendScalar(out, in, element);
    }
  } else {
    AppendScalar(out, in, type);
  }
  return out;
}

bool FromText(std::string_view text, Type type, Writer& out) {
  out.Raw(static_cast<std::uint8_t>(type));
  if (type == Type::String) {
    out.RawText(text);
    return true;
  }
  Type element = protocol::ElementType(type);
  if (element == type) return type != Type::Params && WriteScalar(text, type, out);
  std::vector<std::string> items = SplitList(text, ',', '\\');
  out.Raw(static_cast<std::uint32_t>(items.size()));
  for (const std::string& item : items)
    if (!WriteScalar(item, element, out)) return false;
  return true;
}

std::string_view TypeName(Type type) {
  switch (type) {
    case Type::String: return "string";
    case Type::Int: return "int";
    case Type::UInt: return "unsigned int";
    case Type::ULong: return "unsigned long long";
    case Type::Bool: return "bool";
    case Type::Float: return "float";
    case Type::Double: return "double";
    case Type::Strings: return "string list";
    case Type::Bools: return "bool list";
    case Type::Floats: return "float list";
    case Type::Doubles: return "double list";
    case Type::Ints: return "int list";
    case Type::ULongs: return "unsigned long long list";
    case Type::Params: return "parameter list";
  }
  return "";
}

}  // namespace client3::host
