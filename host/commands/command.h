// What a command of the application is: its line in the catalogue (protocol/catalogue.h) and its
// handler, which reads the command's inputs and writes its outputs in the declared order. Every
// handler is written once, in the file of its area in this folder:
//
//   CLIENT3_HANDLER(GetFrameCount, Read) {
//     out.Put(static_cast<std::uint32_t>(context.scene.frames));
//   }
//
// It is declared below for every command of the catalogue, so that a command without its handler
// does not link. A handler checks everything before it changes anything, so that a refused command
// leaves the scene as it was.
#pragma once

#include <mutex>
#include <shared_mutex>
#include <string>

#include "host/scene/failure.h"
#include "host/scene/scene.h"
#include "protocol/catalogue.h"
#include "protocol/wire.h"

namespace client3::host {

class Faults;

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
  const Faults& faults;  // the test-only faults that commands obey (server/faults.h)
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

// Command C: how it holds the scene, and its handler, which throws Failure when it refuses.
template <protocol::Id C>
struct Handler {
  static const Access access;
  static void Run(Context& context, protocol::Reader& in, protocol::Writer& out);
};
#define CLIENT3_DECLARE_HANDLER(name, ...)                             \
  template <> const Access Handler<protocol::Id::name>::access; \
  template <> void Handler<protocol::Id::name>::Run(Context&, protocol::Reader&, protocol::Writer&);
CLIENT3_COMMANDS(CLIENT3_DECLARE_HANDLER)
#undef CLIENT3_DECLARE_HANDLER

// Defines the handler of command `name`, which holds the scene as `how` (Read, Write or Stage) says;
// the block that follows is its body, with `context`, `in` and `out`.
#define CLIENT3_HANDLER(name, how)                                                                               \
  template <> const Access Handler<protocol::Id::name>::access = Access::how;                                  \
  template <>                                                                                                    \
  void Handler<protocol::Id::name>::Run([[maybe_unused]] Context& context, [[maybe_unused]] protocol::Reader& in, \
                                        [[maybe_unused]] protocol::Writer& out)

}  // namespace client3::host
