// Test-only misbehaviour of the application, chosen on its command line (--fault, see the reference
// page), so that every result code of the library can be provoked: replies that come late, broken,
// cut short or never, or with another result code; per-frame replies of several frames; slow
// stages; a crash at a given request.
#pragma once

#include <atomic>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "host/server/reply.h"
#include "platform/net.h"

namespace client3::host {

class Faults {
 public:
  // Adds KIND[=VALUE][@COMMAND]; false when that is no fault.
  bool Add(std::string_view fault);

  // How many frames a per-frame reply carries.
  int framesPerFrame() const { return framesPerFrame_; }
  // How long a processing stage waits at each tenth of its work, in milliseconds.
  int stageDelay() const { return stageDelay_; }

  // Called as command `id` starts to run: the exit fault ends the process there, as a crash would.
  void Starting(protocol::Id id) const;
  // Sends `reply` to a request for command `id` (none when the request named no command), or
  // misbehaves as a fault says; false when the connection is to be closed.
  bool Send(platform::Socket& socket, Reply& reply, std::optional<protocol::Id> id) const;

 private:
  struct ReplyFault {
    enum Kind { Delay, Garbage, Close, Text, Status, Oversize, Announce } kind;
    int value = 0;
    std::string command;  // empty: every command
  };
  const ReplyFault* For(protocol::Id id) const;

  int framesPerFrame_ = 1;
  int stageDelay_ = 0;
  std::vector<ReplyFault> replies_;
  int exitAt_ = 0;            // the request to exit at (0: never) ...
  std::string exitCommand_;   // ... counting only this command's requests when not empty
  mutable std::atomic<int> requests_{0};
};

}  // namespace client3::host
