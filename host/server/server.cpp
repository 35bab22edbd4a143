// Connections, frames, and the running of each request's command under the scene's lock.
#include "host/server/server.h"

#include <cstdio>
#include <cstring>
#include <list>
#include <memory>
#include <mutex>
#include <thread>

#include "host/server/dispatch.h"
#include "host/server/log.h"
#include "host/server/throttle.h"
#include "platform/net.h"

namespace client3::host {

using platform::Clock;
using platform::Io;
using platform::Socket;
using protocol::CommandOf;
using protocol::DecodeError;
using protocol::Id;
using protocol::Reader;
using protocol::Writer;

namespace {

// A client has this long to say hello after connecting.
constexpr auto kHelloTime = std::chrono::seconds(10);
// A frame, once begun, must arrive whole within this time.
constexpr auto kFrameTime = std::chrono::seconds(30);

struct Shared {
  Scene& scene;
  SceneLock sceneLock;          // held shared by reads and stages at work, alone by writes
  std::mutex writeLock;         // held by every command but reads for its whole run: one writer at a time
  const Options& options;
};

struct Client {
  Socket socket;
  std::thread thread;
  std::atomic<bool> done{false};
};

enum class Got { Frame, Closed, TooLarge };

// Reads a frame of at most `most` bytes whose header comes before `deadline`; the rest must follow
// within kFrameTime.
Got ReadFrame(Socket& socket, std::vector<char>& payload, std::uint32_t most, Clock::time_point deadline) {
  char header[protocol::kHeaderSize];
  if (socket.ReceiveAll(header, sizeof header, deadline) != Io::Done) return Got::Closed;
  std::uint32_t size;
  std::memcpy(&size, header, sizeof size);
  if (size == 0 || size > most) return Got::TooLarge;
  deadline = std::min(deadline, Clock::now() + kFrameTime);
  return socket.ReceiveGrowing(payload, size, deadline) == Io::Done ? Got::Frame : Got::Closed;
}

void SendRefusal(Socket& socket, std::string_view message) {
  Writer frame(protocol::Refusal);
  frame.RawText(message);
  Send(socket, frame);
}

// Whether `given` is the token the application wants, compared in a time that does not depend on
// where the two differ.
bool TokenMatches(std::string_view given, const std::string& wanted) {
  if (wanted.empty()) return true;
  std::size_t difference = given.size() ^ wanted.size();
  for (std::size_t i = 0; i < given.size(); ++i) difference |= static_cast<unsigned char>(given[i] ^ wanted[i % wanted.size()]);
  return difference == 0;
}

bool Handshake(Socket& socket, const Options& options) {
  std::vector<char> payload;
  if (ReadFrame(socket, payload, options.maxFrame, Clock::now() + kHelloTime) != Got::Frame) return false;
  try {
    Reader hello(payload.data(), payload.size());
    char magic[sizeof protocol::kMagic];
    if (hello.Raw<char>() != protocol::Hello) throw DecodeError("");
    for (char& c : magic) c = hello.Raw<char>();
    if (std::memcmp(magic, protocol::kMagic, sizeof magic) != 0) throw DecodeError("");
    auto version = hello.Raw<std::uint16_t>();
    auto count = hello.Raw<std::uint16_t>();
    std::string_view token = hello.RawText();
    if (!TokenMatches(token, options.token)) {
      LogLine("warning", token.empty() ? "a client was refused: it did not give the access token"
                                       : "a client was refused: it gave a wrong access token");
      SendRefusal(socket, token.empty() ? "the application needs its access token, and the client did not give it"
                                        : "the access token the client gave is not the application's");
      return false;
    }
    if (version != protocol::kVersion || count != protocol::kCommandCount) {
      SendRefusal(socket, "this application speaks version " + std::to_string(protocol::kVersion) + " of the protocol with " +
                              std::to_string(protocol::kCommandCount) + " commands");
      return false;
    }
  } catch (const DecodeError&) {
    SendRefusal(socket, "this is not a client of the application");
    return false;
  }
  Writer reply(protocol::Hello);
  reply.Raw(protocol::kVersion);
  reply.Raw(static_cast<std::uint16_t>(protocol::kCommandCount));
  Send(socket, reply);
  return true;
}

// A request's number and the number of its command.
struct Request {
  std::uint32_t id;
  std::uint16_t command;
};

std::optional<Request> RequestOf(Reader& in) {
  try {
    if (in.Raw<char>() != protocol::Request) return std::nullopt;
    std::uint32_t id = in.Raw<std::uint32_t>();
    return Request{id, in.Raw<std::uint16_t>()};
  } catch (const DecodeError&) {
    return std::nullopt;
  }
}

// Runs the request's command with the scene held as the command's access says, and makes its reply.
// Returns the command, or nothing when the request names none.
std::optional<Id> Answer(Shared& shared, Context& context, Request request, Reader& in, Reply& reply) {
  reply.Start(request.id);
  if (request.command >= protocol::kCommandCount) {
    reply.Refuse(Refused, "no command number " + std::to_string(request.command));
    return std::nullopt;
  }
  auto id = static_cast<Id>(request.command);
  try {
    try {
      protocol::Validate(in, CommandOf(id).in);
    } catch (const DecodeError& error) {
      Refuse("the request for '" + std::string(CommandOf(id).name) + "' does not match the command: " + error.what());
    }
    Access access = AccessOf(id);
    std::unique_lock<std::mutex> writing(shared.writeLock, std::defer_lock);
    if (access != Access::Read) writing.lock();
    std::shared_lock<SceneLock> reading(shared.sceneLock, std::defer_lock);
    std::unique_lock<SceneLock> alone(shared.sceneLock, std::defer_lock);
    if (access == Access::Write) alone.lock();
    else reading.lock();
    context.reading = access == Access::Stage ? &reading : nullptr;
    context.summary.clear();
    shared.options.faults.Starting(id);
    Run(id, context, in, reply.frame());
    if (!context.summary.empty()) reply.Say(context.summary);
  } catch (const Failure& failure) {
    reply.Refuse(failure.status, failure.message);
  } catch (const std::bad_alloc&) {
    reply.Refuse(Refused, "the application ran out of memory for this request");
  } catch (const std::exception& error) {
    reply.Refuse(Refused, error.what());
  }
  return id;
}

void ServeClient(Shared& shared, Client& client) {
  Socket& socket = client.socket;
  std::string language = "en";
  Context context{shared.scene, language, shared.options.faults};
  std::vector<char> payload;
  Reply reply;
  Throttle throttle(shared.options.rate);
  for (bool serving = Handshake(socket, shared.options); serving;) {
    protocol::Trim(payload);
    reply.Trim();
    Got got = ReadFrame(socket, payload, shared.options.maxFrame, Clock::time_point::max());
    if (got == Got::TooLarge) SendRefusal(socket, "a frame may hold at most " + std::to_string(shared.options.maxFrame) + " bytes");
    if (got != Got::Frame) break;
    throttle.Wait();
    Reader in(payload.data(), payload.size());
    std::optional<Request> request = RequestOf(in);
    if (!request) {
      SendRefusal(socket, "a frame that is not a request");
      break;
    }
    serving = shared.options.faults.Send(socket, reply, Answer(shared, context, *request, in, reply));
  }
  socket.Shutdown();
  client.done = true;
}

}  // namespace

int Serve(const Options& options, Scene& scene, const std::atomic<bool>& stop) {
  std::string error;
  Socket listener = Socket::Listen(options.host, options.port, error);
  if (!listener.valid()) {
    std::fprintf(stderr, "cannot listen on %s port %d: %s\n", options.host.c_str(), options.port, error.c_str());
    return 1;
  }
  bool v6 = options.host.find(':') != std::string::npos;
  std::printf("listening on %s%s%s:%d\n", v6 ? "[" : "", options.host.c_str(), v6 ? "]" : "", listener.LocalPort());
  std::fflush(stdout);
  LogLine("info", "serving scene '" + scene.Name() + "' of " + std::to_string(scene.frames) + " frames");

  Shared shared{scene, {}, {}, options};
  std::list<Client> clients;
  while (!stop) {
    Socket socket = listener.Accept(std::chrono::milliseconds(100));
    clients.remove_if([](Client& c) {
      if (!c.done) return false;
      c.thread.join();
      return true;
    });
    if (!socket.valid()) continue;
    if (clients.size() >= options.maxClients) {
      SendRefusal(socket, "the application serves at most " + std::to_string(options.maxClients) + " clients at once");
      continue;
    }
    Client& client = clients.emplace_back();
    client.socket = std::move(socket);
    client.thread = std::thread(ServeClient, std::ref(shared), std::ref(client));
  }
  listener.Close();
  for (Client& c : clients) c.socket.Shutdown();
  for (Client& c : clients) c.thread.join();
  LogLine("info", "stopped");
  return 0;
}

}  // namespace client3::host
