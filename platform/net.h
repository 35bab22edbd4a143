// The small platform layer under the library and the host: TCP sockets with time limits, the stop
// signals of a console process, replacing a file in one step, and the local time. Everything
// system-specific of the library and the host lives behind these few functions; threads are the
// standard library's.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <ctime>
#include <string>
#include <vector>

namespace client3::platform {

using Clock = std::chrono::steady_clock;

// TimedOut: nothing arrived in time; Stalled: part of the bytes arrived, the rest did not.
enum class Io { Done, TimedOut, Stalled, Closed };

// Why a connection could not be made, alike on every system: the name is not known, the name could
// not be looked up (the resolver's words in `detail`), nothing listens on the port, nothing
// answered in time, or another reason in the system's words.
struct ConnectFailure {
  enum Cause { None, NameNotFound, Lookup, Refused, TimedOut, Other } cause = None;
  std::string detail;
};

class Socket {
public:
  Socket() = default;
  ~Socket() { Close(); }
  Socket(Socket&& other) noexcept : handle_(other.handle_) { other.handle_ = kInvalid; }
  Socket& operator=(Socket&& other) noexcept {
    if (this != &other) {
      Close();
      handle_ = other.handle_;
      other.handle_ = kInvalid;
    }
    return *this;
  }
  Socket(const Socket&) = delete;
  Socket& operator=(const Socket&) = delete;

  // A connection to host:port, given up after `timeout`. On failure the socket is closed and
  // `failure` says why (for a name with several addresses, why the last one failed).
  static Socket Connect(const std::string& host, int port, Clock::duration timeout, ConnectFailure& failure);
  // A listening socket on host:port (port 0: one the system picks).
  static Socket Listen(const std::string& host, int port, std::string& error);

  bool valid() const { return handle_ != kInvalid; }
  // The port this socket is bound to.
  int LocalPort() const;
  // The next connection, or an invalid socket when none came within `timeout`.
  Socket Accept(Clock::duration timeout);

  // Sends every byte; false when the connection is gone.
  bool SendAll(const char* data, std::size_t size);
  // Receives exactly `size` bytes before `deadline` (Clock::time_point::max() waits as long as it takes).
  Io ReceiveAll(char* data, std::size_t size, Clock::time_point deadline);
  // Receives exactly `size` bytes into `into`, which grows as they come (from 64 KiB, doubling), so
  // that a length announced and never sent costs no memory.
  Io ReceiveGrowing(std::vector<char>& into, std::size_t size, Clock::time_point deadline);
  // Whether the peer has closed its end (looked at without waiting and without taking any data).
  bool PeerClosed() const;

  // Ends both directions: a thread blocked on this socket returns.
  void Shutdown();
  void Close();

private:
#ifdef _WIN32
  using Handle = std::uintptr_t;
  static constexpr Handle kInvalid = ~Handle(0);
#else
  using Handle = int;
  static constexpr Handle kInvalid = -1;
#endif
  explicit Socket(Handle handle) : handle_(handle) {}
  // Waits until the socket can be read (or written); false at the deadline.
  bool Wait(bool write, Clock::time_point deadline) const;
  Handle handle_ = kInvalid;
};

// Calls `stop` once when the process is asked to stop (SIGINT and SIGTERM, or the console's close
// events). `stop` must only do what is safe in a signal handler: set an atomic flag.
void OnStopRequest(void (*stop)());

// Replaces `path` with `temporary` in one step: a reader sees the old file or the new one. Paths
// are UTF-8.
bool ReplaceFile(const std::string& temporary, const std::string& path);

// The calendar time `time` in the local time zone.
std::tm LocalTime(std::time_t time);

}  // namespace client3::platform
