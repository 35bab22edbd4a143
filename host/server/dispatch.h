// The dispatch of requests to the handlers of commands/: one entry per command of the catalogue, made
// from its command lists in the order of the commands' numbers.
#pragma once

#include "host/commands/command.h"

namespace client3::host {

// How command `id` holds the scene.
Access AccessOf(protocol::Id id);

// Runs command `id` with the inputs in `in` (already checked against the declaration) and writes
// its outputs to `out`. Throws Failure when the command is refused.
void Run(protocol::Id id, Context& context, protocol::Reader& in, protocol::Writer& out);

}  // namespace client3::host
