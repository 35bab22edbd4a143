// Sockets, stop requests, file replacement and local time on POSIX systems and on Windows.
#include "platform/net.h"

#include <cerrno>
#include <cstdio>
#include <cstring>

#ifdef _WIN32
#include <winsock2.h>
#include <ws2tcpip.h>
#include <windows.h>
// <windows.h> names its own ReplaceFile as a macro for ReplaceFileA/W; ours keeps its name.
#undef ReplaceFile
#else
#include <arpa/inet.h>
#include <csignal>
#include <fcntl.h>
#include <netdb.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>
#endif

namespace client3::platform {

namespace {

#ifdef _WIN32
using Length = int;
constexpr int kSendFlags = 0;
int LastError() { return WSAGetLastError(); }
bool InProgress(int error) { return error == WSAEWOULDBLOCK || error == WSAEINPROGRESS; }
bool Interrupted(int) { return false; }
// select() rather than WSAPoll: WSAPoll of some Windows versions never reports a connection attempt
// that failed, where select() names it among the exceptions.
int PollOnce(pollfd* fd, int ms) {
  auto s = static_cast<SOCKET>(fd->fd);
  fd_set readable, writable, failed;
  FD_ZERO(&readable);
  FD_ZERO(&writable);
  FD_ZERO(&failed);
  if (fd->events & POLLIN) FD_SET(s, &readable);
  if (fd->events & POLLOUT) {
    FD_SET(s, &writable);
    FD_SET(s, &failed);
  }
  timeval limit{ms / 1000, (ms % 1000) * 1000};
  int ready = ::select(0, &readable, &writable, &failed, ms < 0 ? nullptr : &limit);
  fd->revents = 0;
  if (ready <= 0) return ready;
  if (FD_ISSET(s, &readable)) fd->revents |= POLLIN;
  if (FD_ISSET(s, &writable)) fd->revents |= POLLOUT;
  if (FD_ISSET(s, &failed)) fd->revents |= POLLERR;
  return 1;
}
void SetBlocking(std::uintptr_t s, bool blocking) {
  u_long nonBlocking = blocking ? 0 : 1;
  ioctlsocket(static_cast<SOCKET>(s), FIONBIO, &nonBlocking);
}
// Windows sockets need the library started once per process.
struct Startup {
  Startup() {
    WSADATA data;
    WSAStartup(MAKEWORD(2, 2), &data);
  }
};
void EnsureStarted() { static Startup startup; }
#else
using Length = socklen_t;
#ifdef MSG_NOSIGNAL
constexpr int kSendFlags = MSG_NOSIGNAL;  // a vanished peer is an error, not a signal
#else
constexpr int kSendFlags = 0;
#endif
int LastError() { return errno; }
bool InProgress(int error) { return error == EINPROGRESS || error == EWOULDBLOCK; }
bool Interrupted(int error) { return error == EINTR; }
int PollOnce(pollfd* fd, int ms) { return ::poll(fd, 1, ms); }
void SetBlocking(int s, bool blocking) {
  int flags = fcntl(s, F_GETFL, 0);
  fcntl(s, F_SETFL, blocking ? (flags & ~O_NONBLOCK) : (flags | O_NONBLOCK));
}
void EnsureStarted() {
#ifdef SO_NOSIGPIPE
#else
  static bool ignored = (std::signal(SIGPIPE, SIG_IGN), true);
  (void)ignored;
#endif
}
#endif

// Milliseconds to wait until `deadline`, bounded so that the value fits an int.
int MillisecondsUntil(Clock::time_point deadline) {
  if (deadline == Clock::time_point::max()) return -1;
  auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now()).count();
  if (left <= 0) return 0;
  return left > 1000000 ? 1000000 : static_cast<int>(left);
}

std::string Describe(int error) {
#ifdef _WIN32
  char text[256] = {};
  FormatMessageA(FORMAT_MESSAGE_FROM_SYSTEM | FORMAT_MESSAGE_IGNORE_INSERTS, nullptr, static_cast<DWORD>(error), 0, text,
                 sizeof text, nullptr);
  std::string message(text);
  while (!message.empty() && (message.back() == '\n' || message.back() == '\r' || message.back() == '.')) message.pop_back();
  return message;
#else
  return std::strerror(error);
#endif
}

struct Addresses {
  addrinfo* list = nullptr;
  ~Addresses() {
    if (list) freeaddrinfo(list);
  }
};

// Looks host:port up; the resolver's code, 0 when it found addresses.
int Resolve(const std::string& host, int port, bool passive, Addresses& out) {
  addrinfo hints{};
  hints.ai_family = AF_UNSPEC;
  hints.ai_socktype = SOCK_STREAM;
  hints.ai_flags = passive ? AI_PASSIVE : 0;
  std::string service = std::to_string(port);
  return getaddrinfo(host.empty() ? nullptr : host.c_str(), service.c_str(), &hints, &out.list);
}

bool NameNotFound(int code) {
#ifdef EAI_NODATA
  if (code == EAI_NODATA) return true;
#endif
  return code == EAI_NONAME;
}

// The resolver's words for its failure `code` (on Windows its codes are the sockets' own).
std::string ResolverText(int code) {
#ifdef _WIN32
  return Describe(code);
#else
  return code == EAI_SYSTEM ? Describe(errno) : gai_strerror(code);
#endif
}

#ifdef _WIN32
bool Refused(int error) { return error == WSAECONNREFUSED; }
bool TimedOut(int error) { return error == WSAETIMEDOUT; }
#else
bool Refused(int error) { return error == ECONNREFUSED; }
bool TimedOut(int error) { return error == ETIMEDOUT; }
#endif

// A failed connection attempt's cause from the system's error.
ConnectFailure FailureOf(int error) {
  if (Refused(error)) return {ConnectFailure::Refused, {}};
  if (TimedOut(error)) return {ConnectFailure::TimedOut, {}};
  return {ConnectFailure::Other, Describe(error)};
}

// A connection's options: small frames go out at once, a closed peer is an error rather than a
// signal, and a peer that vanished without closing (its machine off, its network gone) is found by
// keep-alive probes after a minute of silence, within two minutes more.
template <class Handle>
void Tune(Handle handle) {
  auto set = [handle](int level, int name, int value) {
    setsockopt(handle, level, name, reinterpret_cast<const char*>(&value), sizeof value);
  };
  set(IPPROTO_TCP, TCP_NODELAY, 1);
#ifdef SO_NOSIGPIPE
  set(SOL_SOCKET, SO_NOSIGPIPE, 1);
#endif
  set(SOL_SOCKET, SO_KEEPALIVE, 1);
#if defined(TCP_KEEPIDLE)
  set(IPPROTO_TCP, TCP_KEEPIDLE, 60);
#elif defined(TCP_KEEPALIVE)
  set(IPPROTO_TCP, TCP_KEEPALIVE, 60);
#endif
#ifdef TCP_KEEPINTVL
  set(IPPROTO_TCP, TCP_KEEPINTVL, 10);
#endif
#ifdef TCP_KEEPCNT
  set(IPPROTO_TCP, TCP_KEEPCNT, 12);
#endif
}

}  // namespace

Socket Socket::Connect(const std::string& host, int port, Clock::duration timeout, ConnectFailure& failure) {
  EnsureStarted();
  Addresses addresses;
  if (int code = Resolve(host, port, false, addresses)) {
    failure = NameNotFound(code) ? ConnectFailure{ConnectFailure::NameNotFound, {}} : ConnectFailure{ConnectFailure::Lookup, ResolverText(code)};
    return {};
  }
  Clock::time_point deadline = Clock::now() + timeout;
  failure = {ConnectFailure::NameNotFound, {}};
  for (addrinfo* a = addresses.list; a; a = a->ai_next) {
    Socket s(static_cast<Handle>(::socket(a->ai_family, a->ai_socktype, a->ai_protocol)));
    if (!s.valid()) {
      failure = FailureOf(LastError());
      continue;
    }
    SetBlocking(s.handle_, false);
    int code = ::connect(s.handle_, a->ai_addr, static_cast<Length>(a->ai_addrlen));
    if (code != 0 && InProgress(LastError())) {
      if (!s.Wait(true, deadline)) {
        failure = {ConnectFailure::TimedOut, {}};
        continue;
      }
      int error = 0;
      Length size = sizeof error;
      getsockopt(s.handle_, SOL_SOCKET, SO_ERROR, reinterpret_cast<char*>(&error), &size);
      code = error == 0 ? 0 : -1;
      if (error) failure = FailureOf(error);
    } else if (code != 0) {
      failure = FailureOf(LastError());
    }
    if (code != 0) continue;
    SetBlocking(s.handle_, true);
    Tune(s.handle_);
    failure = {};
    return s;
  }
  return {};
}

Socket Socket::Listen(const std::string& host, int port, std::string& error) {
  EnsureStarted();
  Addresses addresses;
  if (int code = Resolve(host, port, true, addresses)) {
    error = "cannot resolve '" + host + "': " + ResolverText(code);
    return {};
  }
  for (addrinfo* a = addresses.list; a; a = a->ai_next) {
    Socket s(static_cast<Handle>(::socket(a->ai_family, a->ai_socktype, a->ai_protocol)));
    if (!s.valid()) continue;
    int one = 1;
#ifdef _WIN32
    // Windows lets a later socket with SO_REUSEADDR take over a bound port unless this one forbids it.
    setsockopt(s.handle_, SOL_SOCKET, SO_EXCLUSIVEADDRUSE, reinterpret_cast<const char*>(&one), sizeof one);
#else
    setsockopt(s.handle_, SOL_SOCKET, SO_REUSEADDR, &one, sizeof one);
#endif
    if (::bind(s.handle_, a->ai_addr, static_cast<Length>(a->ai_addrlen)) != 0 || ::listen(s.handle_, 64) != 0) {
      error = Describe(LastError());
      continue;
    }
    error.clear();
    return s;
  }
  if (error.empty()) error = "no address to listen on";
  return {};
}

int Socket::LocalPort() const {
  sockaddr_storage address{};
  Length size = sizeof address;
  if (getsockname(handle_, reinterpret_cast<sockaddr*>(&address), &size) != 0) return -1;
  if (address.ss_family == AF_INET6) return ntohs(reinterpret_cast<sockaddr_in6*>(&address)->sin6_port);
  return ntohs(reinterpret_cast<sockaddr_in*>(&address)->sin_port);
}

Socket Socket::Accept(Clock::duration timeout) {
  if (!Wait(false, Clock::now() + timeout)) return {};
  Socket s(static_cast<Handle>(::accept(handle_, nullptr, nullptr)));
  if (s.valid()) Tune(s.handle_);
  return s;
}

bool Socket::Wait(bool write, Clock::time_point deadline) const {
  for (;;) {
    pollfd fd{};
    fd.fd = handle_;
    fd.events = write ? POLLOUT : POLLIN;
    int ready = PollOnce(&fd, MillisecondsUntil(deadline));
    if (ready > 0) return true;
    if (ready == 0 && MillisecondsUntil(deadline) == 0) return false;
    if (ready < 0 && !Interrupted(LastError())) return true;  // the next call on the socket reports it
  }
}

bool Socket::SendAll(const char* data, std::size_t size) {
  while (size > 0) {
    int chunk = size > (1u << 30) ? (1 << 30) : static_cast<int>(size);
    auto sent = ::send(handle_, data, chunk, kSendFlags);
    if (sent <= 0) {
      if (sent < 0 && Interrupted(LastError())) continue;
      return false;
    }
    data += sent;
    size -= static_cast<std::size_t>(sent);
  }
  return true;
}

Io Socket::ReceiveAll(char* data, std::size_t size, Clock::time_point deadline) {
  const char* start = data;
  while (size > 0) {
    if (deadline != Clock::time_point::max() && !Wait(false, deadline)) return data == start ? Io::TimedOut : Io::Stalled;
    int chunk = size > (1u << 30) ? (1 << 30) : static_cast<int>(size);
    auto got = ::recv(handle_, data, chunk, 0);
    if (got <= 0) {
      if (got < 0 && Interrupted(LastError())) continue;
      return Io::Closed;
    }
    data += got;
    size -= static_cast<std::size_t>(got);
  }
  return Io::Done;
}

Io Socket::ReceiveGrowing(std::vector<char>& into, std::size_t size, Clock::time_point deadline) {
  constexpr std::size_t kFirstChunk = 64 << 10;
  std::size_t have = 0;
  into.resize(size < kFirstChunk ? size : kFirstChunk);
  for (;;) {
    if (Io io = ReceiveAll(into.data() + have, into.size() - have, deadline); io != Io::Done)
      return io == Io::TimedOut && have ? Io::Stalled : io;
    if ((have = into.size()) == size) return Io::Done;
    into.resize(size < 2 * have ? size : 2 * have);
  }
}

bool Socket::PeerClosed() const {
  if (!valid()) return true;
  pollfd fd{};
  fd.fd = handle_;
  fd.events = POLLIN;
  if (PollOnce(&fd, 0) <= 0) return false;
  if (fd.revents & (POLLERR | POLLHUP | POLLNVAL)) return true;
  char byte;
#ifdef _WIN32
  return ::recv(handle_, &byte, 1, MSG_PEEK) <= 0;
#else
  return ::recv(handle_, &byte, 1, MSG_PEEK | MSG_DONTWAIT) == 0;
#endif
}

void Socket::Shutdown() {
  if (!valid()) return;
#ifdef _WIN32
  ::shutdown(handle_, SD_BOTH);
  // On Windows a shutdown alone leaves a thread blocked in recv() waiting; cancelling the socket's
  // pending operations wakes it.
  CancelIoEx(reinterpret_cast<HANDLE>(handle_), nullptr);
#else
  ::shutdown(handle_, SHUT_RDWR);
#endif
}

void Socket::Close() {
  if (!valid()) return;
#ifdef _WIN32
  ::closesocket(handle_);
#else
  ::close(handle_);
#endif
  handle_ = kInvalid;
}

namespace {
void (*stopHandler)() = nullptr;
#ifdef _WIN32
BOOL WINAPI ConsoleEvent(DWORD event) {
  if (stopHandler) stopHandler();
  // Closing the console, logging off and shutting down end the process as soon as this returns:
  // waiting here gives the process time to stop by itself (it ends this thread when it exits).
  if (event == CTRL_CLOSE_EVENT || event == CTRL_LOGOFF_EVENT || event == CTRL_SHUTDOWN_EVENT) Sleep(4000);
  return TRUE;
}
#else
void StopSignal(int) {
  if (stopHandler) stopHandler();
}
#endif
}  // namespace

void OnStopRequest(void (*stop)()) {
  stopHandler = stop;
#ifdef _WIN32
  SetConsoleCtrlHandler(ConsoleEvent, TRUE);
#else
  struct sigaction action {};
  action.sa_handler = StopSignal;
  sigemptyset(&action.sa_mask);
  sigaction(SIGINT, &action, nullptr);
  sigaction(SIGTERM, &action, nullptr);
#endif
}

#ifdef _WIN32
namespace {
// A UTF-8 path as Windows' own UTF-16; empty when it is not valid UTF-8.
std::wstring Widen(const std::string& text) {
  int size = MultiByteToWideChar(CP_UTF8, MB_ERR_INVALID_CHARS, text.data(), static_cast<int>(text.size()), nullptr, 0);
  std::wstring wide(static_cast<std::size_t>(size > 0 ? size : 0), L'\0');
  if (size > 0) MultiByteToWideChar(CP_UTF8, MB_ERR_INVALID_CHARS, text.data(), static_cast<int>(text.size()), wide.data(), size);
  return wide;
}
}  // namespace
#endif

bool ReplaceFile(const std::string& temporary, const std::string& path) {
#ifdef _WIN32
  std::wstring from = Widen(temporary), to = Widen(path);
  if (from.empty() || to.empty()) return false;
  return MoveFileExW(from.c_str(), to.c_str(), MOVEFILE_REPLACE_EXISTING | MOVEFILE_WRITE_THROUGH) != 0;
#else
  return std::rename(temporary.c_str(), path.c_str()) == 0;
#endif
}

std::tm LocalTime(std::time_t time) {
  std::tm local{};
#ifdef _WIN32
  localtime_s(&local, &time);
#else
  localtime_r(&time, &local);
#endif
  return local;
}

}  // namespace client3::platform
