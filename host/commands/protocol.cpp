// The handlers of the connection and the command protocol: the application's description, its
// command list and each command's description, commands run by name, and the connection's settings.
#include <algorithm>
#include <array>

#include "host/commands/command.h"
#include "host/server/byname.h"
#include "host/server/log.h"
#include "host/server/text.h"

namespace client3::host {

namespace {

const std::array<std::string_view, 6> kLanguages = {"en", "de", "fr", "es", "ja", "zh"};
const std::array<std::string_view, 4> kLevels = {"debug", "info", "warning", "error"};

}  // namespace

CLIENT3_HANDLER(GetServerInfo, Read) {
  out.Put("Pellux Post");
  out.Put(std::uint32_t{1}), out.Put(std::uint32_t{0}), out.Put(std::uint32_t{0});
  out.Put("Release");
}

CLIENT3_HANDLER(GetCommandList, Read) {
  out.PutTexts(protocol::kCommands, [](const protocol::Command& c) { return c.name; });
}

CLIENT3_HANDLER(GetCommandInfo, Read) {
  std::string_view name = in.Text();
  std::optional<protocol::Id> id = CommandNamed(name);
  if (!id) Refuse("no command named '" + std::string(name) + "'");
  const protocol::Command& command = protocol::CommandOf(*id);
  out.Put(command.name);
  out.Put(command.description);
  using Pair = std::pair<std::string_view, std::string_view>;
  out.PutPairs(command.in, [](const protocol::Param& p) { return Pair(p.name, p.fallback); });
  out.PutPairs(command.out, [](const protocol::Param& p) { return Pair(p.name, TypeName(p.type)); });
}

CLIENT3_HANDLER(ProcessRequest, Write) {
  std::string name(in.Text());
  protocol::NameValues given, used, outputs;
  in.GetPairs([&](std::string_view n, std::string_view v) { given.push_back({std::string(n), std::string(v)}); });
  RunByName(context, name, given, used, outputs);
  protocol::NameValues all = used;
  all.insert(all.end(), outputs.begin(), outputs.end());
  out.Put(all);
  out.Put(outputs);
}

// "Command Name=Value ...": the outputs come back one "Name=Value" line each.
CLIENT3_HANDLER(PSL, Write) {
  std::vector<std::string> words = Words(in.Text());
  if (words.empty()) Refuse("the command line is empty");
  protocol::NameValues given, used, outputs;
  for (std::size_t i = 1; i < words.size(); ++i) {
    std::size_t equals = words[i].find('=');
    if (equals == std::string::npos) Refuse("'" + words[i] + "' is not of the form Name=Value");
    given.push_back({words[i].substr(0, equals), words[i].substr(equals + 1)});
  }
  RunByName(context, words[0], given, used, outputs);
  std::string text;
  for (const protocol::NameValue& p : outputs) text += p.name + "=" + p.value + "\n";
  out.Put(text);
}

CLIENT3_HANDLER(GetFrameCount, Read) { out.Put(static_cast<std::uint32_t>(context.scene.frames)); }

CLIENT3_HANDLER(SetLanguage, Write) {
  std::string_view language = in.Text();
  if (std::find(kLanguages.begin(), kLanguages.end(), language) == kLanguages.end())
    Refuse("'" + std::string(language) + "' is not a language of the application (en, de, fr, es, ja, zh)");
  context.language = std::string(language);
}

CLIENT3_HANDLER(Log, Read) {
  std::string_view level = in.Text(), message = in.Text();
  if (std::find(kLevels.begin(), kLevels.end(), level) == kLevels.end())
    Refuse("'" + std::string(level) + "' is not a log level (debug, info, warning, error)");
  LogLine(level, message);
}

}  // namespace client3::host
