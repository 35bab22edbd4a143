#include "host/server/byname.h"

#include <algorithm>
#include <unordered_map>

#include "host/server/dispatch.h"
#include "host/server/text.h"

namespace client3::host {

using protocol::CommandOf;
using protocol::Id;

std::optional<Id> CommandNamed(std::string_view name) {
  static const auto byName = [] {
    std::unordered_map<std::string_view, Id> map;
    for (std::size_t i = 0; i < protocol::kCommandCount; ++i) map.emplace(protocol::kCommands[i].name, static_cast<Id>(i));
    return map;
  }();
  auto found = byName.find(name);
  if (found == byName.end()) return std::nullopt;
  return found->second;
}

void RunByName(Context& context, std::string_view name, const protocol::NameValues& given, protocol::NameValues& used,
               protocol::NameValues& outputs) {
  std::optional<Id> id = CommandNamed(name);
  if (!id) Refuse("no command named '" + std::string(name) + "'");
  if (*id == Id::ProcessRequest || *id == Id::PSL) Refuse(std::string(1, '\'').append(name).append("' cannot be run by name"));
  const protocol::Command& command = CommandOf(*id);
  for (const protocol::NameValue& p : given) {
    auto declared = [&](const protocol::Param& d) { return d.name == p.name; };
    if (std::none_of(command.in.begin(), command.in.end(), declared) &&
        std::none_of(command.out.begin(), command.out.end(), declared))
      Refuse("'" + std::string(name) + "' has no parameter named '" + p.name + "'");
  }
  protocol::Writer inputs;
  for (const protocol::Param& d : command.in) {
    auto value = std::find_if(given.begin(), given.end(), [&](const protocol::NameValue& p) { return p.name == d.name; });
    std::string_view text = value == given.end() ? d.fallback : std::string_view(value->value);
    if (!FromText(text, d.type, inputs))
      Refuse("parameter '" + std::string(d.name) + "' of '" + std::string(name) + "' is not a " + std::string(TypeName(d.type)) + ": '" +
             std::string(text) + "'");
    used.push_back({std::string(d.name), std::string(text)});
  }
  protocol::Reader in(inputs.Finish().substr(protocol::kHeaderSize));
  protocol::Writer out;
  Run(*id, context, in, out);
  protocol::Reader results(out.Finish().substr(protocol::kHeaderSize));
  for (const protocol::Param& d : command.out) outputs.push_back({std::string(d.name), ToText(results, d.type)});
}

std::vector<std::string> Words(std::string_view line) {
  std::vector<std::string> words;
  std::string word;
  bool quoted = false, any = false;
  for (std::size_t i = 0; i < line.size(); ++i) {
    char c = line[i];
    if (quoted && c == '\\' && i + 1 < line.size()) {
      word += line[++i];
    } else if (c == '"') {
      quoted = !quoted, any = true;
    } else if (!quoted && (c == ' ' || c == '\t')) {
      if (any) words.push_back(std::move(word)), word.clear(), any = false;
    } else {
      word += c, any = true;
    }
  }
  if (quoted) Refuse("the command line has an unterminated quote");
  if (any) words.push_back(std::move(word));
  return words;
}

}  // namespace client3::host
