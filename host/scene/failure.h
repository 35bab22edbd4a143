// How the application refuses a command: a result code and the message the client receives.
#pragma once

#include <cstdint>
#include <string>
#include <utility>

namespace client3::host {

// The result codes the application answers with.
enum Status : std::int32_t { Ok = 0, Refused = 1003, BadFrame = 1004 };

struct Failure {
  Status status;
  std::string message;
};

// Throws Failure{Refused, message}.
[[noreturn]] inline void Refuse(std::string message) { throw Failure{Refused, std::move(message)}; }

}  // namespace client3::host
