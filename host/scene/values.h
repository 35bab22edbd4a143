// Values as the application writes them in text: numbers in their shortest exact form, the typed
// values of attributes, lists separated by commas, and runs of frames.
#pragma once

#include <charconv>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace client3::host {

// A number that is the whole of `text`, or nothing.
template <class T>
std::optional<T> ParseNumber(std::string_view text) {
  T value;
  auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
  if (text.empty() || error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return value;
}
// "true" or "1", "false" or "0".
std::optional<bool> ParseBool(std::string_view text);
// A finite number.
std::optional<double> ParseDouble(std::string_view text);
std::optional<std::int32_t> ParseInt(std::string_view text);
// A number in its shortest form that reads back exactly; FloatText: as a float.
std::string NumberText(double value);
std::string FloatText(double value);

// Calls `each` with every item of a list whose items `separator` separates (the text "" is one empty
// item). With an `escape` character, that character takes the next one into the item as it is.
template <class Each>
void ForEachItem(std::string_view list, Each each, char separator = ',', char escape = '\0') {
  std::string item;
  for (std::size_t i = 0, from = 0; i <= list.size(); ++i) {
    if (i == list.size() || list[i] == separator) {
      each(escape ? std::string_view(item) : list.substr(from, i - from));
      item.clear(), from = i + 1;
    } else if (escape) {
      item += list[i] == escape && i + 1 < list.size() ? list[++i] : list[i];
    }
  }
}
// The items of a list as ForEachItem finds them, except that the text "" is the empty list.
std::vector<std::string> SplitList(std::string_view list, char separator = ',', char escape = '\0');

// The runs of consecutive indices from 0 to `size` - 1 where `holds(i)`, as [first, end) pairs.
using IndexRange = std::pair<std::size_t, std::size_t>;
template <class Holds>
std::vector<IndexRange> Runs(std::size_t size, Holds holds) {
  std::vector<IndexRange> runs;
  for (std::size_t i = 0; i < size; ++i) {
    if (!holds(i)) continue;
    std::size_t first = i;
    while (i + 1 < size && holds(i + 1)) ++i;
    runs.emplace_back(first, i + 1);
  }
  return runs;
}
// Runs as frame ranges "FIRST-LAST,...", frames numbered from 1.
std::string RangesText(const std::vector<IndexRange>& runs);

// The types of attribute values and their text forms.
enum class ValueType : std::int32_t {
  Bool = 0,    // "true" or "false" ("1" and "0" accepted)
  Int = 1,     // a signed 32-bit decimal number
  Float = 2,   // a 64-bit floating-point number in its shortest exact form
  String = 3,  // any text
  Vector = 4,  // three Floats separated by commas
};
std::string_view ValueTypeName(ValueType type);
// The canonical text of a value of `type` written as `text`; nothing when it is not one.
std::optional<std::string> Canonical(ValueType type, std::string_view text);
// The three numbers of a Vector text; a part that is missing or no number reads 0.
std::vector<double> VectorOf(std::string_view text);
std::string VectorText(const std::vector<double>& v);

}  // namespace client3::host
