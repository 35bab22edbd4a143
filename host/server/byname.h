// Commands run by name with their values as text: the generic request (ProcessRequest) and the
// command line (PSL).
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "host/commands/command.h"

namespace client3::host {

// The command of that name, if there is one.
std::optional<protocol::Id> CommandNamed(std::string_view name);

// Runs a command whose inputs are given as name and text pairs; `used` receives every input as it
// was used (defaults filled in) and `outputs` the outputs, both as text.
void RunByName(Context& context, std::string_view name, const protocol::NameValues& given, protocol::NameValues& used,
               protocol::NameValues& outputs);

// Splits a command line into words: blanks separate them, double quotes group them, and a
// backslash inside quotes takes the next character as it is.
std::vector<std::string> Words(std::string_view line);

}  // namespace client3::host
