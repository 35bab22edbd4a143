// Connections, frames and the dispatch of commands.
#include "host/server.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <list>
#include <memory>
#include <mutex>
#include <thread>

#include "host/throttle.h"
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
  std::atomic<int> requests{0};  // counted for the exit fault only
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

void Send(Socket& socket, Writer& frame) {
  std::string_view bytes = frame.Finish();
  socket.SendAll(bytes.data(), bytes.size());
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

const ReplyFault* FaultFor(const Options& options, Id id) {
  for (const ReplyFault& fault : options.replyFaults)
    if (fault.command.empty() || fault.command == CommandOf(id).name) return &fault;
  return nullptr;
}

// Rewrites a successful reply so that its numeric scalars come as texts that are no numbers.
void NumbersAsText(Writer& reply, std::size_t outputsAt, Id id) {
  std::string_view frame = reply.Finish();
  std::string copy(frame.substr(protocol::kHeaderSize));
  Reader outputs(copy.data() + outputsAt, copy.size() - outputsAt);
  Writer rewritten;
  rewritten.Append(copy.data(), outputsAt);
  for (const protocol::Param& p : CommandOf(id).out) {
    const char* at = outputs.position();
    outputs.Skip(p.type);
    if (protocol::FixedSize(p.type))
      rewritten.Put("not a number");
    else
      rewritten.Append(at, static_cast<std::size_t>(outputs.position() - at));
  }
  reply = std::move(rewritten);
}

// The exit fault: the process ends on the spot, as if it had crashed in the middle of a command.
void ExitOnFault(Shared& shared, Id id) {
  const Options& options = shared.options;
  if (options.exitAt > 0 && (options.exitCommand.empty() || options.exitCommand == CommandOf(id).name) &&
      ++shared.requests == options.exitAt)
    std::_Exit(3);
}

// Sends a reply, or misbehaves as a fault says.
bool SendReply(Socket& socket, Writer& reply, const ReplyFault* fault) {
  if (!fault) return Send(socket, reply), true;
  switch (fault->kind) {
    case ReplyFault::Delay:
      std::this_thread::sleep_for(std::chrono::milliseconds(fault->value));
      break;
    case ReplyFault::Garbage:
      reply.Clear(static_cast<protocol::Kind>('?'));
      reply.Append("garbage", 7);
      break;
    case ReplyFault::Close: {
      std::string_view bytes = reply.Finish();
      socket.SendAll(bytes.data(), bytes.size() / 2);
      return false;
    }
    case ReplyFault::Oversize:
    case ReplyFault::Announce: {
      // A reply too large to take, then the end; or the largest reply, of which nothing follows.
      std::uint32_t size = fault->kind == ReplyFault::Oversize ? protocol::kMaxFrame + 1 : protocol::kMaxFrame;
      socket.SendAll(reinterpret_cast<const char*>(&size), sizeof size);
      return fault->kind == ReplyFault::Announce;
    }
    default:
      break;
  }
  Send(socket, reply);
  return true;
}

void ServeClient(Shared& shared, Client& client) {
  Socket& socket = client.socket;
  std::string language = "en";
  Context context{shared.scene, language, shared.options.faults};
  std::vector<char> payload;
  Writer reply;
  Throttle throttle(shared.options.rate);
  if (Handshake(socket, shared.options)) {
    for (;;) {
      protocol::Trim(payload);
      reply.Trim();
      Got got = ReadFrame(socket, payload, shared.options.maxFrame, Clock::time_point::max());
      if (got == Got::TooLarge) {
        SendRefusal(socket, "a frame may hold at most " + std::to_string(shared.options.maxFrame) + " bytes");
        break;
      }
      if (got == Got::Closed) break;
      throttle.Wait();
      std::uint32_t requestId;
      std::uint16_t command;
      Reader in(payload.data(), payload.size());
      try {
        if (in.Raw<char>() != protocol::Request) throw DecodeError("");
        requestId = in.Raw<std::uint32_t>();
        command = in.Raw<std::uint16_t>();
      } catch (const DecodeError&) {
        SendRefusal(socket, "a frame that is not a request");
        break;
      }
      auto id = static_cast<Id>(command);
      auto header = [&](Status status, std::string_view message) {
        reply.Clear(protocol::Reply);
        reply.Raw(requestId);
        reply.Raw(static_cast<std::int32_t>(status));
        reply.RawText(message);
      };
      bool ok = false;
      header(Ok, "");
      std::size_t outputsAt = reply.size() - protocol::kHeaderSize;
      try {
        if (command >= protocol::kCommandCount) Refuse("no command number " + std::to_string(command));
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
        ExitOnFault(shared, id);
        Run(id, context, in, reply);
        if (!context.summary.empty()) {
          // The summary goes where the reply's message is, before the outputs.
          std::string outputs(reply.Finish().substr(protocol::kHeaderSize + outputsAt));
          header(Ok, context.summary);
          outputsAt = reply.size() - protocol::kHeaderSize;
          reply.Append(outputs.data(), outputs.size());
        }
        ok = true;
      } catch (const Failure& failure) {
        header(failure.status, failure.message);
      } catch (const std::bad_alloc&) {
        header(Refused, "the application ran out of memory for this request");
      } catch (const std::exception& error) {
        header(Refused, error.what());
      }
      const ReplyFault* fault = command < protocol::kCommandCount ? FaultFor(shared.options, id) : nullptr;
      if (ok && fault && fault->kind == ReplyFault::Text)
        NumbersAsText(reply, outputsAt, id);
      if (fault && fault->kind == ReplyFault::Status) header(static_cast<Status>(fault->value), "");
      if (!SendReply(socket, reply, fault)) break;
    }
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
