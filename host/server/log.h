// The application's log: one line per entry on standard error, with the date, the time and the level.
#pragma once

#include <string_view>

namespace client3::host {

// Writes one entry. Text from clients is escaped so that it cannot start a line of its own.
void LogLine(std::string_view level, std::string_view message);

}  // namespace client3::host
