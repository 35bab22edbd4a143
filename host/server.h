// The application's network side: it accepts clients on one address, serves each on a thread of its
// own, and runs their commands against the shared scene: reads side by side, changes one at a time.
#pragma once

#include <atomic>
#include <string>
#include <vector>

#include "host/commands.h"
#include "host/scene.h"

namespace client3::host {

// Test-only misbehaviour of replies: each applies to every command, or to the one named after '@'.
struct ReplyFault {
  enum Kind { Delay, Garbage, Close, Text, Status, Oversize, Announce } kind;
  int value = 0;
  std::string command;  // empty: every command
};

struct Options {
  std::string host = "127.0.0.1";
  int port = 8870;
  std::string scene = "demo";
  int frames = 1000;
  std::size_t maxClients = 64;
  std::string token;                               // the access token clients must present; empty: none
  std::uint32_t maxFrame = protocol::kMaxFrame;     // the largest request payload accepted
  int rate = 100000;                               // requests per second served to one client; 0: no limit
  Faults faults;
  std::vector<ReplyFault> replyFaults;
  int exitAt = 0;           // test only: exit at once on this request (0: never) ...
  std::string exitCommand;  // ... counting only this command's requests when not empty
};

// Serves until `stop` becomes true; returns the process's exit status.
int Serve(const Options& options, Scene& scene, const std::atomic<bool>& stop);

}  // namespace client3::host
