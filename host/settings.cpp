// The settings records: their defaults and ranges (from the library's record descriptions), and the
// commands that read and replace them.
#include "host/settings.h"

#include <cmath>
#include <algorithm>
#include <cstdlib>
#include <optional>
#include <span>

#include "host/handlers.h"
#include "host/text.h"

namespace client3::host {

using protocol::Id;
using protocol::Reader;
using protocol::Type;
using protocol::Writer;

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
  Id get, set;
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
  {#record, Id::OfflineGet##record##Settings, Id::OfflineSet##record##Settings, k##record##Fields, k##record##Order},
const RecordRule kRecords[kRecordCount] = {CLIENT3_SETTINGS(CLIENT3_RECORD_RULE, )};
#undef CLIENT3_RECORD_RULE

const RecordRule& RuleOf(Record record) { return kRecords[static_cast<std::size_t>(record)]; }

std::size_t FieldIndex(Record record, std::string_view field) {
  const RecordRule& rule = RuleOf(record);
  for (std::size_t i = 0; i < rule.fields.size(); ++i)
    if (rule.fields[i].name == field) return i;
  LogLine("error", "no settings field '" + std::string(field) + "' in '" + std::string(rule.name) + "'");
  std::abort();
}

std::string Plain(double v) {
  return v == std::floor(v) ? std::to_string(static_cast<long long>(v)) : NumberText(v);
}

std::string RangeText(const FieldRule& f) {
  if (!f.words.empty()) {
    std::string words(f.words);
    for (char& c : words)
      if (c == '|') c = ',';
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
      for (std::size_t from = 0; from <= f.words.size() && !allowed;) {
        std::size_t bar = std::min(f.words.find('|', from), f.words.size());
        allowed = f.words.substr(from, bar - from) == text;
        from = bar + 1;
      }
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

template <Record R>
void Get(Context& context, Reader&, Writer& out) {
  const RecordRule& rule = RuleOf(R);
  auto declared = protocol::CommandOf(rule.get).out;
  const std::vector<std::string>& values = context.scene.settings.values[static_cast<std::size_t>(R)];
  for (std::size_t i = 0; i < declared.size(); ++i) FromText(values[i], declared[i].type, out);
}

template <Record R>
void Set(Context& context, Reader& in, Writer&) {
  const RecordRule& rule = RuleOf(R);
  std::vector<std::string> texts;
  for (const protocol::Param& p : protocol::CommandOf(rule.set).in) {
    std::string text = ToText(in, p.type);
    // Text fields travel as they are; ToText escapes list separators that a single word keeps.
    if (p.type == Type::String) {
      std::string plain;
      for (std::size_t i = 0; i < text.size(); ++i) plain += text[i] == '\\' && i + 1 < text.size() ? text[++i] : text[i];
      text = plain;
    }
    texts.push_back(std::move(text));
  }
  if (std::string why = Problem(rule, texts); !why.empty()) Refuse(why);
  context.scene.settings.values[static_cast<std::size_t>(R)] = std::move(texts);
  LogLine("info", "settings " + std::string(rule.name) + " set: " + context.scene.settings.Summary(R));
}

#define CLIENT3_HANDLERS(X, record, what)                                 \
  {Id::OfflineGet##record##Settings, &Get<Record::record>, Access::Read}, \
  {Id::OfflineSet##record##Settings, &Set<Record::record>},
constexpr HandlerEntry kHandlers[] = {CLIENT3_SETTINGS(CLIENT3_HANDLERS, )};
#undef CLIENT3_HANDLERS

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

std::string SetRecordFromText(Settings& settings, std::string_view name, const std::vector<std::string>& texts) {
  for (std::size_t r = 0; r < kRecordCount; ++r) {
    const RecordRule& rule = RuleOf(static_cast<Record>(r));
    if (rule.name != name) continue;
    auto declared = protocol::CommandOf(rule.get).out;
    if (texts.size() != declared.size()) return "the " + std::string(name) + " settings need " + std::to_string(declared.size()) + " values";
    std::vector<std::string> canonical;
    for (std::size_t i = 0; i < texts.size(); ++i) {
      if (declared[i].type == Type::String) {
        canonical.push_back(texts[i]);
        continue;
      }
      Writer w;
      if (!FromText(texts[i], declared[i].type, w)) return "a bad value of " + std::string(name) + " setting '" + std::string(declared[i].name) + "'";
      Reader back(w.Finish().substr(protocol::kHeaderSize));
      canonical.push_back(ToText(back, declared[i].type));
    }
    if (std::string why = Problem(rule, canonical); !why.empty()) return why;
    settings.values[r] = std::move(canonical);
    return {};
  }
  return "no settings named '" + std::string(name) + "'";
}

std::span<const HandlerEntry> SettingsHandlers() { return kHandlers; }

}  // namespace client3::host
