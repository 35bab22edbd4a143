// client3-host: the post-processing application, serving one scene to its clients.
//
//   client3-host [--host 127.0.0.1] [--port 8870] [--scene demo|empty|FILE] [--frames 1000]
//                [--token SECRET] [--files DIR]... [--max-clients 64] [--max-frame BYTES] [--rate N]
//                [--watch-stdin]
//
// It listens on loopback unless told otherwise, and another address needs an access token (--token,
// or the environment variable CLIENT3_TOKEN) that every client must present.
// The first line on standard output is "listening on HOST:PORT" (with --port 0, the port the system
// picked). The log goes to standard error. SIGINT and SIGTERM stop it cleanly.
#include <atomic>
#include <charconv>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <string_view>
#include <thread>
#include <type_traits>
#include <vector>

#include "host/files/scenefile.h"
#include "host/files/access.h"
#include "host/server/server.h"
#include "platform/net.h"

using namespace client3::host;

namespace {

std::atomic<bool> stopRequested{false};
void RequestStop() { stopRequested = true; }

// --watch-stdin: the program that started the application holds the other end of its standard input;
// when that end closes (the program ended, however abruptly), the application stops.
void StopAtEndOfInput() {
  std::thread([] {
    while (std::fgetc(stdin) != EOF) {
    }
    RequestStop();
  }).detach();
}

bool ParseInt(std::string_view text, int& out, int least, int most) {
  std::optional<int> value = ParseNumber<int>(text);
  if (!value || *value < least || *value > most) return false;
  out = *value;
  return true;
}

// An address that only this machine reaches: "localhost", "::1" or a dotted 127.x.y.z.
bool IsLoopback(std::string_view host) {
  if (host == "localhost" || host == "::1") return true;
  std::vector<std::string> parts = SplitList(host, '.');
  int value = 0;
  for (std::size_t i = 0; i < parts.size(); ++i)
    if (!ParseInt(parts[i], value, i == 0 ? 127 : 0, i == 0 ? 127 : 255)) return false;
  return parts.size() == 4;
}

int Usage(const char* problem) {
  if (problem) std::fprintf(stderr, "client3-host: %s\n", problem);
  std::fprintf(problem ? stderr : stdout,
               "usage: client3-host [--host ADDRESS] [--port N] [--scene demo|empty|FILE] [--frames N] [--token SECRET]\n"
               "                    [--files DIR]... [--max-clients N] [--max-frame N] [--rate N]\n"
               "  --host ADDRESS   the address to listen on (default 127.0.0.1)\n"
               "  --port N         the port (default 8870; 0 picks a free one)\n"
               "  --scene SCENE    demo (default), empty, or a scene file\n"
               "  --frames N       frames of the demo and empty scenes, 1 to 1000000 (default 1000)\n"
               "  --token SECRET   the access token clients must give (default: $CLIENT3_TOKEN; needed\n"
               "                   for an address other than loopback)\n"
               "  --files DIR      file commands may use only this directory (repeatable; default: any)\n"
               "  --max-clients N  clients served at once (default 64)\n"
               "  --max-frame N    the largest request in bytes, 64 to 67108864 (default 67108864)\n"
               "  --rate N         requests per second served to each client, 0 for no limit (default 100000)\n"
               "  --watch-stdin    stop when standard input reaches its end\n"
               "  --fault FAULT    test only: misbehave as FAULT says (see the reference page)\n");
  return problem ? 2 : 0;
}

// Takes the value of one option; the problem with it, if there is one.
std::optional<std::string> TakeOption(std::string_view option, std::string_view value, Options& options,
                                      std::vector<std::string>& files) {
  auto number = [&](auto& out, int least, int most) -> std::optional<std::string> {
    int parsed = 0;
    if (!ParseInt(value, parsed, least, most))
      return std::string(option) + " takes a number from " + std::to_string(least) + " to " + std::to_string(most);
    out = static_cast<std::remove_reference_t<decltype(out)>>(parsed);
    return std::nullopt;
  };
  if (option == "--host") options.host = value;
  else if (option == "--port") return number(options.port, 0, 65535);
  else if (option == "--scene") options.scene = value;
  else if (option == "--frames") return number(options.frames, 1, 1000000);
  else if (option == "--max-clients") return number(options.maxClients, 1, 4096);
  else if (option == "--max-frame") return number(options.maxFrame, 64, static_cast<int>(client3::protocol::kMaxFrame));
  else if (option == "--rate") return number(options.rate, 0, 100000000);
  else if (option == "--token") options.token = value;
  else if (option == "--files") files.emplace_back(value);
  else if (option == "--fault") {
    if (!options.faults.Add(value)) return "unknown fault '" + std::string(value) + "'";
  } else {
    return "unknown option " + std::string(option);
  }
  return std::nullopt;
}

// The scene to serve: the demo, an empty one, or a scene file's (refused, Failure, when it cannot
// be read or is damaged).
Scene FirstScene(const Options& options) {
  if (options.scene == "demo") return DemoScene(options.frames);
  if (options.scene == "empty") return EmptyScene(options.frames);
  return LoadScene(options.scene);
}

}  // namespace

int main(int argc, char** argv) {
  Options options;
  if (const char* token = std::getenv("CLIENT3_TOKEN")) options.token = token;
  std::vector<std::string> files;
  for (int i = 1; i < argc; ++i) {
    std::string_view option = argv[i];
    if (option == "--help" || option == "-h") return Usage(nullptr);
    if (option == "--watch-stdin") {
      StopAtEndOfInput();
      continue;
    }
    if (i + 1 >= argc) return Usage(("option " + std::string(option) + " needs a value").c_str());
    if (std::optional<std::string> problem = TakeOption(option, argv[++i], options, files)) return Usage(problem->c_str());
  }
  if (options.token.empty() && !IsLoopback(options.host))
    return Usage(("listening on " + options.host + " needs an access token: give --token or CLIENT3_TOKEN").c_str());
  if (std::string bad; !ConfineFiles(files, bad)) return Usage(("--files: no directory at '" + bad + "'").c_str());
  Scene scene;
  try {
    scene = FirstScene(options);
  } catch (const Failure& failure) {
    return Usage(failure.message.c_str());
  }
  client3::platform::OnStopRequest(RequestStop);
  return Serve(options, scene, stopRequested);
}
