// How the application answers a command: each command of the catalogue has a handler that reads its
// inputs and writes its outputs in the declared order. A handler checks everything before it
// changes anything, so that a refused command leaves the scene as it was.
#pragma once

#include <mutex>
#include <shared_mutex>
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
  int stageDelay = 0;      // milliseconds a processing stage waits at each tenth of its work
};

// The log: one line per entry on standard error; text from clients is escaped so that it cannot
// start a line of its own.
void LogLine(std::string_view level, std::string_view message);

// How a command holds the scene while it runs. Reads share it with other reads; a write holds it
// alone. A stage works out its result while sharing the scene with readers and holds it alone only
// to write that result; writers are kept out for its whole run, so nothing changes in between.
enum class Access { Read, Write, Stage };

// The scene's lock, shared by reads and held alone by writes. A write waiting for it keeps new reads
// out until it has had its turn, so that a steady stream of reads cannot hold a write off.
class SceneLock {
 public:
  void lock() {
    std::lock_guard<std::mutex> turn(gate_);
    scene_.lock();
  }
  void unlock() { scene_.unlock(); }
  void lock_shared() {
    { std::lock_guard<std::mutex> turn(gate_); }
    scene_.lock_shared();
  }
  void unlock_shared() { scene_.unlock_shared(); }

 private:
  std::shared_mutex scene_;
  std::mutex gate_;
};

// What a command may use: the scene (held for the command's whole run, as its Access says) and the
// connection's own settings.
struct Context {
  Scene& scene;
  std::string& language;
  const Faults& faults;
  // For a stage: its shared hold on the scene, to be traded for the exclusive one while it writes.
  // Null when the command already holds the scene alone.
  std::shared_lock<SceneLock>* reading = nullptr;
  // What the command did, in one line, for the message of its reply when it succeeds: set by the
  // processing stages and the filters, empty for every other command.
  std::string summary = {};
};

// Runs `write` with the scene held alone, then shares it again.
template <class Write>
void Exclusively(Context& context, Write write) {
  if (!context.reading) return write();
  context.reading->unlock();
  {
    std::unique_lock<SceneLock> alone(*context.reading->mutex());
    write();
  }
  context.reading->lock();
}

// How command `id` holds the scene.
Access AccessOf(protocol::Id id);

// Runs command `id` with the inputs in `in` (already checked against the declaration) and writes
// its outputs to `out`. Throws Failure when the command is refused.
void Run(protocol::Id id, Context& context, protocol::Reader& in, protocol::Writer& out);

}  // namespace client3::host
