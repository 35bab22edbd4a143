// The floors that bench_client.py measures the module against: framed request/reply exchanges over
// loopback with nothing but blocking send and recv, TCP_NODELAY on both ends. The benchmark builds
// it with g++ -O2 into a temporary folder.
//
//   floor pingpong REQUEST REPLY CALLS RUNS      a server thread answers every REQUEST-byte payload
//                                                with a fixed REPLY-byte payload; the client loops
//   floor bulk REQUEST FRAMES CALLS RUNS         the server answers with a trajectory reply of FRAMES
//                                                frames; the client decodes it into four vectors
//   floor serve REPLY                            the server alone, for a client in another process:
//                                                prints "listening on 127.0.0.1:PORT", serves one
//                                                connection and exits when it closes
//   floor host PORT SUBJECT MARKER CALLS RUNS TRAJECTORY_CALLS
//                                                a raw client of the real host on PORT: handshake,
//                                                then GetFrameCount and GetTrajectory requests
//
// Each measurement prints "name best_ns_per_call" (the best of RUNS runs of CALLS calls, after a
// tenth of CALLS untimed), and the host mode also prints the frame sizes it saw. Every wait on a
// socket is bounded by a receive timeout; any failure exits non-zero with a message on standard
// error.
#include <arpa/inet.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>

#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "protocol/wire.h"

namespace {

namespace wire = client3::protocol;
using Clock = std::chrono::steady_clock;

[[noreturn]] void Fail(const char* what) {
  std::fprintf(stderr, "floor: %s: %s\n", what, std::strerror(errno));
  std::exit(1);
}
[[noreturn]] void Refuse(const std::string& what) {
  std::fprintf(stderr, "floor: %s\n", what.c_str());
  std::exit(1);
}

void Tune(int fd) {
  int one = 1;
  setsockopt(fd, IPPROTO_TCP, TCP_NODELAY, &one, sizeof one);
  timeval limit{10, 0};  // no wait lasts longer than this
  setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
  setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit);
}

int Listen(int& port) {
  int fd = ::socket(AF_INET, SOCK_STREAM, 0);
  if (fd < 0) Fail("socket");
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  address.sin_port = 0;
  if (::bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) Fail("bind");
  if (::listen(fd, 1) != 0) Fail("listen");
  socklen_t size = sizeof address;
  getsockname(fd, reinterpret_cast<sockaddr*>(&address), &size);
  port = ntohs(address.sin_port);
  return fd;
}

int Connect(int port) {
  int fd = ::socket(AF_INET, SOCK_STREAM, 0);
  if (fd < 0) Fail("socket");
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  address.sin_port = htons(static_cast<std::uint16_t>(port));
  Tune(fd);
  if (::connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) Fail("connect");
  return fd;
}

int Accept(int listener) {
  timeval limit{10, 0};
  setsockopt(listener, SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
  int fd = ::accept(listener, nullptr, nullptr);
  if (fd < 0) Fail("accept");
  Tune(fd);
  return fd;
}

void SendAll(int fd, const char* data, std::size_t size) {
  while (size > 0) {
    ssize_t sent = ::send(fd, data, size, MSG_NOSIGNAL);
    if (sent <= 0) Fail("send");
    data += sent, size -= static_cast<std::size_t>(sent);
  }
}

// False when the peer closed before the first byte.
bool ReceiveAll(int fd, char* data, std::size_t size) {
  bool first = true;
  while (size > 0) {
    ssize_t got = ::recv(fd, data, size, 0);
    if (got == 0 && first) return false;
    if (got <= 0) Fail("recv");
    data += got, size -= static_cast<std::size_t>(got);
    first = false;
  }
  return true;
}

// One frame's payload into `payload` (kept between calls, as a client keeps its buffer).
bool ReceiveFrame(int fd, std::vector<char>& payload) {
  std::uint32_t size;
  if (!ReceiveAll(fd, reinterpret_cast<char*>(&size), sizeof size)) return false;
  if (size == 0 || size > wire::kMaxFrame) Refuse("a frame of " + std::to_string(size) + " bytes");
  payload.resize(size);
  if (!ReceiveAll(fd, payload.data(), size)) Refuse("the peer closed inside a frame");
  return true;
}

template <class T>
void Put(std::string& frame, T value) {
  frame.append(reinterpret_cast<const char*>(&value), sizeof value);
}
void Tag(std::string& frame, wire::Type type) { frame.push_back(static_cast<char>(type)); }

// Stamps the payload length into the first four bytes.
std::string Finish(std::string frame) {
  auto size = static_cast<std::uint32_t>(frame.size() - wire::kHeaderSize);
  std::memcpy(frame.data(), &size, sizeof size);
  return frame;
}

// A frame of `size` payload bytes of no particular meaning beyond its first byte.
std::string Filler(char kind, std::size_t size) {
  std::string frame(wire::kHeaderSize, '\0');
  frame.push_back(kind);
  frame.resize(wire::kHeaderSize + size, '\0');
  return Finish(std::move(frame));
}

// A successful reply carrying one marker's trajectory over `frames` frames.
std::string TrajectoryReply(std::uint32_t frames) {
  std::string frame(wire::kHeaderSize, '\0');
  frame.push_back(wire::Reply);
  Put<std::uint32_t>(frame, 0);  // request id
  Put<std::int32_t>(frame, 0);   // result code
  Put<std::uint32_t>(frame, 0);  // empty message
  for (int axis = 0; axis < 3; ++axis) {
    Tag(frame, wire::Type::Doubles);
    Put(frame, frames);
    for (std::uint32_t i = 0; i < frames; ++i) Put(frame, 0.5 * i + axis);
  }
  Tag(frame, wire::Type::Bools);
  Put(frame, frames);
  for (std::uint32_t i = 0; i < frames; ++i) frame.push_back(static_cast<char>(i % 7 != 0));
  return Finish(std::move(frame));
}

// Answers every request frame with `reply` until the client closes.
void Serve(int fd, const std::string& reply) {
  std::vector<char> request;
  while (ReceiveFrame(fd, request)) SendAll(fd, reply.data(), reply.size());
  ::close(fd);
}

// What a client makes of a trajectory reply: three vectors of doubles and one of bools.
struct Trajectory {
  std::vector<double> x, y, z;
  std::vector<bool> e;
};

class Cursor {
public:
  explicit Cursor(const std::vector<char>& payload) : at_(payload.data()), end_(payload.data() + payload.size()) {}
  template <class T>
  T Get() {
    T value;
    std::memcpy(&value, Take(sizeof value), sizeof value);
    return value;
  }
  const char* Take(std::size_t size) {
    if (size > static_cast<std::size_t>(end_ - at_)) Refuse("a reply ends too early");
    const char* p = at_;
    at_ += size;
    return p;
  }
  std::uint32_t Count(wire::Type type) {
    if (static_cast<wire::Type>(Get<std::uint8_t>()) != type) Refuse("a reply value of the wrong type");
    return Get<std::uint32_t>();
  }
  void Doubles(std::vector<double>& out) {
    std::uint32_t n = Count(wire::Type::Doubles);
    const char* bytes = Take(std::size_t{n} * sizeof(double));
    out.resize(n);
    std::memcpy(out.data(), bytes, std::size_t{n} * sizeof(double));
  }
  void Bools(std::vector<bool>& out) {
    std::uint32_t n = Count(wire::Type::Bools);
    const char* bytes = Take(n);
    out.assign(n, false);
    for (std::uint32_t i = 0; i < n; ++i) out[i] = bytes[i] != 0;
  }
  bool done() const { return at_ == end_; }

private:
  const char* at_;
  const char* end_;
};

// Checks a reply's header and returns a cursor at its outputs.
Cursor Outputs(const std::vector<char>& payload) {
  Cursor c(payload);
  if (c.Get<char>() != wire::Reply) Refuse("not a reply");
  c.Get<std::uint32_t>();
  if (auto code = c.Get<std::int32_t>(); code != 0) Refuse("the host answered with code " + std::to_string(code));
  c.Take(c.Get<std::uint32_t>());
  return c;
}

Trajectory Decode(const std::vector<char>& payload) {
  Cursor c = Outputs(payload);
  Trajectory t;
  c.Doubles(t.x), c.Doubles(t.y), c.Doubles(t.z), c.Bools(t.e);
  if (!c.done()) Refuse("a trajectory reply has more values than four");
  return t;
}

// The best time per call over `runs` runs of `calls` calls of `once`, after an untimed tenth.
template <class F>
double Best(long calls, int runs, F once) {
  for (long i = 0; i < calls / 10 + 1; ++i) once();
  double best = 1e300;
  for (int run = 0; run < runs; ++run) {
    auto start = Clock::now();
    for (long i = 0; i < calls; ++i) once();
    double ns = std::chrono::duration<double, std::nano>(Clock::now() - start).count() / static_cast<double>(calls);
    if (ns < best) best = ns;
  }
  return best;
}

volatile std::size_t sink;  // keeps the decoded vectors from being optimised away

long Number(const char* text, long least, long most) {
  char* end = nullptr;
  long value = std::strtol(text, &end, 10);
  if (!*text || *end || value < least || value > most) Refuse(std::string("'") + text + "' is out of range");
  return value;
}

// A server thread answering with `reply`, and a connected client socket.
struct Pair {
  std::thread server;
  int client = -1;
  explicit Pair(std::string reply) {
    int port = 0;
    int listener = Listen(port);
    server = std::thread([listener, reply = std::move(reply)] {
      int fd = Accept(listener);
      ::close(listener);
      Serve(fd, reply);
    });
    client = Connect(port);
  }
  ~Pair() {
    ::close(client);
    server.join();
  }
};

int PingPong(long request, long reply, long calls, int runs) {
  Pair pair(Filler(wire::Reply, static_cast<std::size_t>(reply)));
  std::string frame = Filler(wire::Request, static_cast<std::size_t>(request));
  std::vector<char> payload;
  double ns = Best(calls, runs, [&] {
    SendAll(pair.client, frame.data(), frame.size());
    if (!ReceiveFrame(pair.client, payload)) Refuse("the server closed");
  });
  std::printf("pingpong %.1f\n", ns);
  return 0;
}

int Bulk(long request, long frames, long calls, int runs) {
  Pair pair(TrajectoryReply(static_cast<std::uint32_t>(frames)));
  std::string frame = Filler(wire::Request, static_cast<std::size_t>(request));
  std::vector<char> payload;
  double ns = Best(calls, runs, [&] {
    SendAll(pair.client, frame.data(), frame.size());
    if (!ReceiveFrame(pair.client, payload)) Refuse("the server closed");
    Trajectory t = Decode(payload);
    sink = t.x.size() + t.y.size() + t.z.size() + t.e.size();
  });
  if (sink != static_cast<std::size_t>(4 * frames)) Refuse("a trajectory of the wrong length");
  std::printf("bulk %.1f\n", ns);
  return 0;
}

int ServeOne(long reply) {
  int port = 0;
  int listener = Listen(port);
  std::printf("listening on 127.0.0.1:%d\n", port);
  std::fflush(stdout);
  int fd = Accept(listener);
  ::close(listener);
  Serve(fd, Filler(wire::Reply, static_cast<std::size_t>(reply)));
  return 0;
}

std::string RequestFrame(std::uint32_t id, wire::Id command) {
  std::string frame(wire::kHeaderSize, '\0');
  frame.push_back(wire::Request);
  Put(frame, id);
  Put(frame, static_cast<std::uint16_t>(command));
  return frame;
}
void PutText(std::string& frame, std::string_view text) {
  Tag(frame, wire::Type::String);
  Put(frame, static_cast<std::uint32_t>(text.size()));
  frame.append(text);
}

int Host(long port, const char* subject, const char* marker, long calls, int runs, long trajectoryCalls) {
  int fd = Connect(static_cast<int>(port));
  std::string hello(wire::kHeaderSize, '\0');
  hello.push_back(wire::Hello);
  hello.append(wire::kMagic, sizeof wire::kMagic);
  Put(hello, wire::kVersion);
  Put(hello, static_cast<std::uint16_t>(wire::kCommandCount));
  Put<std::uint32_t>(hello, 0);  // no access token
  hello = Finish(std::move(hello));
  SendAll(fd, hello.data(), hello.size());
  std::vector<char> payload;
  if (!ReceiveFrame(fd, payload) || payload.empty() || payload[0] != wire::Hello) Refuse("the host refused the handshake");

  // The host answers each request id as it was sent, so one frame serves every call.
  std::string count = Finish(RequestFrame(1, wire::Id::GetFrameCount));
  SendAll(fd, count.data(), count.size());
  ReceiveFrame(fd, payload);
  std::printf("count_request_frame %zu\ncount_reply_frame %zu\n", count.size(), payload.size() + wire::kHeaderSize);
  double ns = Best(calls, runs, [&] {
    SendAll(fd, count.data(), count.size());
    if (!ReceiveFrame(fd, payload)) Refuse("the host closed");
    Cursor c = Outputs(payload);
    sink = c.Count(wire::Type::UInt);
  });
  std::printf("host_count %.1f\n", ns);

  std::string trajectory = RequestFrame(2, wire::Id::GetTrajectory);
  PutText(trajectory, subject);
  PutText(trajectory, marker);
  trajectory = Finish(std::move(trajectory));
  SendAll(fd, trajectory.data(), trajectory.size());
  ReceiveFrame(fd, payload);
  std::size_t frames = Decode(payload).x.size();
  std::printf("trajectory_request_frame %zu\ntrajectory_reply_frame %zu\ntrajectory_frames %zu\n", trajectory.size(),
              payload.size() + wire::kHeaderSize, frames);
  ns = Best(trajectoryCalls, runs, [&] {
    SendAll(fd, trajectory.data(), trajectory.size());
    if (!ReceiveFrame(fd, payload)) Refuse("the host closed");
    Trajectory t = Decode(payload);
    sink = t.x.size() + t.y.size() + t.z.size() + t.e.size();
  });
  std::printf("host_trajectory %.1f\n", ns);
  ::close(fd);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  std::string_view mode = argc > 1 ? argv[1] : "";
  const long kMost = 100'000'000;
  if (mode == "pingpong" && argc == 6)
    return PingPong(Number(argv[2], 1, 1 << 20), Number(argv[3], 1, 1 << 20), Number(argv[4], 1, kMost),
                    static_cast<int>(Number(argv[5], 1, 1000)));
  if (mode == "bulk" && argc == 6)
    return Bulk(Number(argv[2], 1, 1 << 20), Number(argv[3], 1, 1'000'000), Number(argv[4], 1, kMost),
                static_cast<int>(Number(argv[5], 1, 1000)));
  if (mode == "serve" && argc == 3) return ServeOne(Number(argv[2], 1, 1 << 20));
  if (mode == "host" && argc == 8)
    return Host(Number(argv[2], 1, 65535), argv[3], argv[4], Number(argv[5], 1, kMost),
                static_cast<int>(Number(argv[6], 1, 1000)), Number(argv[7], 1, kMost));
  std::fprintf(stderr,
               "usage: floor pingpong REQUEST REPLY CALLS RUNS | bulk REQUEST FRAMES CALLS RUNS | serve REPLY |\n"
               "       floor host PORT SUBJECT MARKER CALLS RUNS TRAJECTORY_CALLS\n");
  return 2;
}
