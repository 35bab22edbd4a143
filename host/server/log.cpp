#include "host/server/log.h"

#include <chrono>
#include <cstdio>
#include <ctime>
#include <string>

#include "platform/net.h"

namespace client3::host {

void LogLine(std::string_view level, std::string_view message) {
  std::string line;
  for (char c : message) {
    if (c == '\n') line += "\\n";
    else if (c == '\r') line += "\\r";
    else if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f) line += '?';
    else line += c;
  }
  std::tm local = platform::LocalTime(std::chrono::system_clock::to_time_t(std::chrono::system_clock::now()));
  char stamp[32];
  std::strftime(stamp, sizeof stamp, "%Y-%m-%d %H:%M:%S", &local);
  std::fprintf(stderr, "%s %.*s %s\n", stamp, static_cast<int>(level.size()), level.data(), line.c_str());
  std::fflush(stderr);
}

}  // namespace client3::host
