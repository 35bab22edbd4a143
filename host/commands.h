// How the application answers a command: each command of the catalogue has a handler that reads its
// inputs and writes its outputs in the declared order. A handler checks everything before it
// changes anything, so that a refused command leaves the scene as it was.
#pragma once

#include <mutex>
#include <string>
#include <string_view>

#include "host/failure.h"
#include "host/scene.h"
#include "protocol/catalogue.h"
#include "protocol/wire.h"

namespace client3::host {

// Test-only misbehaviour of the host, chosen on its command line.
struct Faults {
  int framesPerFrame = 1;  // how many frames a per-frame reply carries
};

// The log: one line per entry on standard error; text from clients is escaped so that it cannot
// start a line of its own.
void LogLine(std::string_view level, std::string_view message);

// What a command may use: the scene (locked for the command's whole run) and the connection's own
// settings.
struct Context {
  Scene& scene;
  std::string& language;
  const Faults& faults;
};

// Runs command `id` with the inputs in `in` (already checked against the declaration) and writes
// its outputs to `out`. Throws Failure when the command is refused.
void Run(protocol::Id id, Context& context, protocol::Reader& in, protocol::Writer& out);

}  // namespace client3::host
