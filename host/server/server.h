// The application's network side: it accepts clients on one address, serves each on a thread of its
// own, and runs their commands against the shared scene: reads side by side, changes one at a time.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <string>

#include "host/scene/scene.h"
#include "host/server/faults.h"

namespace client3::host {

struct Options {
  std::string host = "127.0.0.1";
  int port = 8870;
  std::string scene = "demo";
  int frames = 1000;
  std::size_t maxClients = 64;
  std::string token;                            // the access token clients must present; empty: none
  std::uint32_t maxFrame = protocol::kMaxFrame;  // the largest request payload accepted
  int rate = 100000;                            // requests per second served to one client; 0: no limit
  Faults faults;                                // test only
};

// Serves until `stop` becomes true; returns the process's exit status.
int Serve(const Options& options, Scene& scene, const std::atomic<bool>& stop);

}  // namespace client3::host
