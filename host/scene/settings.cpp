// The settings records: their defaults and ranges, from the library's record descriptions.
#include "host/scene/settings.h"

#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <optional>
#include <span>

#include "host/scene/values.h"

namespace client3::host {

using protocol::Type;

namespace {

// A field's default and what it may hold: numbers from `least` to `most`, or one of the words in
// `words` ("A|B|C"); booleans may hold either value.
struct FieldRule {
  std::string_view name, fallback;
  double least = 0, most = 0;
  std::string_view words = {};

  constexpr FieldRule(std::string_view name, std::string_view fallback) : name(name), fallback(fallback) {}
  constexpr FieldRule(std::string_view name, std::string_view fallback, double least, double most)
      : name(name), fallback(fallback), least(least), most(most) {}
  constexpr FieldRule(std::string_view name, std::string_view fallback, std::string_view words)
      : name(name), fallback(fallback), words(words) {}
};

// Two fields of one record where the first may not exceed the second.
struct OrderRule {
  std::string_view low, high;
};

template <class T, class... R>
constexpr std::array<T, sizeof...(R)> Rules(int, R... rules) {
  return {rules...};
}

struct RecordRule {
  std::string_view name;
  protocol::Id get;
  std::span<const FieldRule> fields;
  std::span<const OrderRule> order;
};

// Each record's rules as the library's record descriptions give them.
#define CLIENT3_FIELD_RULE(type, name, fallback, ...) , FieldRule{#name, #fallback __VA_OPT__(, ) __VA_ARGS__}
#define CLIENT3_ORDER_RULE(low, high) , OrderRule{#low, #high}
#define CLIENT3_RULES(X, record, what)                                                                               \
  constexpr auto k##record##Fields = Rules<FieldRule>(0 ZARVO_FIELDS_Output_##record##Settings(CLIENT3_FIELD_RULE)); \
  constexpr auto k##record##Order = Rules<OrderRule>(0 ZARVO_ORDER_Output_##record##Settings(CLIENT3_ORDER_RULE));
CLIENT3_SETTINGS(CLIENT3_RULES, )
#undef CLIENT3_RULES
#undef CLIENT3_ORDER_RULE
#undef CLIENT3_FIELD_RULE

#define CLIENT3_RECORD_RULE(X, record, what)                                                                          \
  {#record, protocol::Id::OfflineGet##record##Settings, k##record##Fields, k##record##Order},
const RecordRule kRecords[kRecordCount] = {CLIENT3_SETTINGS(CLIENT3_RECORD_RULE, )};
#undef CLIENT3_RECORD_RULE

const RecordRule& RuleOf(Record record) { return kRecords[static_cast<std::size_t>(record)]; }

std::size_t FieldIndex(Record record, std::string_view field) {
  const RecordRule& rule = RuleOf(record);
  for (std::size_t i = 0; i < rule.fields.size(); ++i)
    if (rule.fields[i].name == field) return i;
  std::fprintf(stderr, "no settings field '%.*s' in '%.*s'\n", static_cast<int>(field.size()), field.data(),
               static_cast<int>(rule.name.size()), rule.name.data());
  std::abort();
}

std::string Plain(double v) {
  return v == std::floor(v) ? std::to_string(static_cast<long long>(v)) : NumberText(v);
}

std::string RangeText(const FieldRule& f) {
  if (!f.words.empty()) {
    std::string words;
    ForEachItem(f.words, [&](std::string_view word) { words.append(words.empty() ? "" : ",").append(word); }, '|');
    return "one of " + words;
  }
  return "from " + Plain(f.least) + " to " + Plain(f.most);
}

// Why `texts` is not a valid value of the record; empty when it is. The texts are canonical.
std::string Problem(const RecordRule& rule, const std::vector<std::string>& texts) {
  auto declared = protocol::CommandOf(rule.get).out;
  for (std::size_t i = 0; i < rule.fields.size(); ++i) {
    const FieldRule& f = rule.fields[i];
    const std::string& text = texts[i];
    std::string what = std::string(rule.name) + " setting '" + std::string(f.name) + "' must be " + RangeText(f) + ", not '" + text + "'";
    if (declared[i].type == Type::Bool) continue;
    if (declared[i].type == Type::String) {
      bool allowed = false;
      ForEachItem(f.words, [&](std::string_view word) { allowed = allowed || word == text; }, '|');
      if (!allowed) return what;
      continue;
    }
    std::optional<double> v = ParseDouble(text);
    if (!v || !(*v >= f.least && *v <= f.most)) return what;
  }
  for (const OrderRule& o : rule.order) {
    std::size_t low = 0, high = 0;
    for (std::size_t i = 0; i < rule.fields.size(); ++i) {
      if (rule.fields[i].name == o.low) low = i;
      if (rule.fields[i].name == o.high) high = i;
    }
    if (*ParseDouble(texts[low]) > *ParseDouble(texts[high]))
      return std::string(rule.name) + " setting '" + std::string(o.low) + "' (" + texts[low] + ") cannot exceed '" + std::string(o.high) +
             "' (" + texts[high] + ")";
  }
  return {};
}

}  // namespace

Settings::Settings() {
  for (std::size_t r = 0; r < kRecordCount; ++r)
    for (const FieldRule& f : kRecords[r].fields) values[r].emplace_back(f.fallback);
}

double Settings::Number(Record record, std::string_view field) const {
  return ParseDouble(Text(record, field)).value_or(0);
}

bool Settings::Flag(Record record, std::string_view field) const { return Text(record, field) == "true"; }

const std::string& Settings::Text(Record record, std::string_view field) const {
  return values[static_cast<std::size_t>(record)][FieldIndex(record, field)];
}

std::string Settings::Summary(Record record) const {
  const RecordRule& rule = RuleOf(record);
  std::string out;
  for (std::size_t i = 0; i < rule.fields.size(); ++i)
    out.append(i ? "," : "").append(rule.fields[i].name).append("=").append(values[static_cast<std::size_t>(record)][i]);
  return out;
}

std::string_view RecordName(Record record) { return RuleOf(record).name; }

std::optional<Record> RecordNamed(std::string_view name) {
  for (std::size_t r = 0; r < kRecordCount; ++r)
    if (kRecords[r].name == name) return static_cast<Record>(r);
  return std::nullopt;
}

std::span<const protocol::Param> FieldsOf(Record record) { return protocol::CommandOf(RuleOf(record).get).out; }

std::string Settings::Set(Record record, std::vector<std::string> texts) {
  if (std::string why = Problem(RuleOf(record), texts); !why.empty()) return why;
  values[static_cast<std::size_t>(record)] = std::move(texts);
  return {};
}

}  // namespace client3::host
