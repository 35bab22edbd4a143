#include "host/scene/values.h"

#include <cmath>

namespace client3::host {

std::optional<bool> ParseBool(std::string_view text) {
  if (text == "true" || text == "1") return true;
  if (text == "false" || text == "0") return false;
  return std::nullopt;
}

std::optional<double> ParseDouble(std::string_view text) {
  std::optional<double> value = ParseNumber<double>(text);
  if (value && !std::isfinite(*value)) return std::nullopt;
  return value;
}

std::optional<std::int32_t> ParseInt(std::string_view text) { return ParseNumber<std::int32_t>(text); }

std::string NumberText(double value) {
  char buffer[64];
  auto [end, error] = std::to_chars(buffer, buffer + sizeof buffer, value);
  return std::string(buffer, error == std::errc() ? end : buffer);
}

std::string FloatText(double value) {
  char buffer[32];
  auto [end, error] = std::to_chars(buffer, buffer + sizeof buffer, static_cast<float>(value));
  return std::string(buffer, error == std::errc() ? end : buffer);
}

std::vector<std::string> SplitList(std::string_view list, char separator, char escape) {
  std::vector<std::string> items;
  if (!list.empty()) ForEachItem(list, [&](std::string_view item) { items.emplace_back(item); }, separator, escape);
  return items;
}

std::string RangesText(const std::vector<IndexRange>& runs) {
  std::string text;
  for (auto [first, end] : runs) text.append(text.empty() ? "" : ",").append(std::to_string(first + 1) + "-" + std::to_string(end));
  return text;
}

std::string_view ValueTypeName(ValueType type) {
  switch (type) {
    case ValueType::Bool: return "Bool";
    case ValueType::Int: return "Int";
    case ValueType::Float: return "Float";
    case ValueType::String: return "String";
    case ValueType::Vector: return "Vector";
  }
  return "";
}

std::optional<std::string> Canonical(ValueType type, std::string_view text) {
  switch (type) {
    case ValueType::Bool:
      if (auto v = ParseBool(text)) return *v ? "true" : "false";
      return std::nullopt;
    case ValueType::Int:
      if (auto v = ParseInt(text)) return std::to_string(*v);
      return std::nullopt;
    case ValueType::Float:
      if (auto v = ParseDouble(text)) return NumberText(*v);
      return std::nullopt;
    case ValueType::String:
      return std::string(text);
    case ValueType::Vector: {
      std::vector<std::string> parts = SplitList(text);
      std::vector<double> v;
      for (const std::string& part : parts)
        if (auto number = ParseDouble(part)) v.push_back(*number);
      if (parts.size() != 3 || v.size() != 3) return std::nullopt;
      return VectorText(v);
    }
  }
  return std::nullopt;
}

std::vector<double> VectorOf(std::string_view text) {
  std::vector<double> v;
  for (const std::string& part : SplitList(text)) v.push_back(ParseDouble(part).value_or(0));
  v.resize(3);
  return v;
}

std::string VectorText(const std::vector<double>& v) { return NumberText(v[0]) + "," + NumberText(v[1]) + "," + NumberText(v[2]); }

}  // namespace client3::host
