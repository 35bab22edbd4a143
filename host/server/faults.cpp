#include "host/server/faults.h"

#include <chrono>
#include <cstdlib>
#include <limits>
#include <thread>

#include "host/scene/values.h"

namespace client3::host {

using protocol::CommandOf;
using protocol::Id;
using protocol::Reader;
using protocol::Writer;

namespace {

// Rewrites a successful reply so that its numeric scalars come as texts that are no numbers.
void NumbersAsText(Reply& reply, Id id) {
  std::string payload(reply.frame().Finish().substr(protocol::kHeaderSize));
  Reader outputs(payload.data() + reply.outputsAt(), payload.size() - reply.outputsAt());
  Writer rewritten;
  rewritten.Append(payload.data(), reply.outputsAt());
  for (const protocol::Param& p : CommandOf(id).out) {
    const char* at = outputs.position();
    outputs.Skip(p.type);
    if (protocol::FixedSize(p.type))
      rewritten.Put("not a number");
    else
      rewritten.Append(at, static_cast<std::size_t>(outputs.position() - at));
  }
  reply.frame() = std::move(rewritten);
}

}  // namespace

bool Faults::Add(std::string_view fault) {
  std::string command;
  if (auto at = fault.find('@'); at != std::string_view::npos) command = fault.substr(at + 1), fault = fault.substr(0, at);
  std::string_view kind = fault.substr(0, fault.find('='));
  std::string_view value = kind.size() < fault.size() ? fault.substr(kind.size() + 1) : std::string_view();
  std::optional<int> number = value.empty() ? 0 : ParseNumber<int>(value);
  if (!number || *number == std::numeric_limits<int>::min()) return false;
  if (kind == "frames") return *number >= 0 && (framesPerFrame_ = *number, true);
  if (kind == "stage-delay") return *number >= 0 && (stageDelay_ = *number, true);
  if (kind == "exit") return *number > 0 && (exitAt_ = *number, exitCommand_ = command, true);
  static const std::pair<std::string_view, ReplyFault::Kind> kinds[] = {
      {"delay", ReplyFault::Delay}, {"garbage", ReplyFault::Garbage}, {"close", ReplyFault::Close},
      {"text", ReplyFault::Text},   {"status", ReplyFault::Status},   {"oversize", ReplyFault::Oversize},
      {"announce", ReplyFault::Announce}};
  for (auto [name, k] : kinds)
    if (kind == name) return replies_.push_back({k, *number, command}), true;
  return false;
}

const Faults::ReplyFault* Faults::For(Id id) const {
  for (const ReplyFault& fault : replies_)
    if (fault.command.empty() || fault.command == CommandOf(id).name) return &fault;
  return nullptr;
}

void Faults::Starting(Id id) const {
  if (exitAt_ > 0 && (exitCommand_.empty() || exitCommand_ == CommandOf(id).name) && ++requests_ == exitAt_) std::_Exit(3);
}

bool Faults::Send(platform::Socket& socket, Reply& reply, std::optional<Id> id) const {
  const ReplyFault* fault = id ? For(*id) : nullptr;
  if (!fault) return host::Send(socket, reply.frame()), true;
  switch (fault->kind) {
    case ReplyFault::Delay:
      std::this_thread::sleep_for(std::chrono::milliseconds(fault->value));
      break;
    case ReplyFault::Garbage:
      reply.frame().Clear(static_cast<protocol::Kind>('?'));
      reply.frame().Append("garbage", 7);
      break;
    case ReplyFault::Close: {
      std::string_view bytes = reply.frame().Finish();
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
    case ReplyFault::Text:
      if (reply.ok()) NumbersAsText(reply, *id);
      break;
    case ReplyFault::Status:
      reply.Refuse(static_cast<Status>(fault->value), "");
      break;
  }
  host::Send(socket, reply.frame());
  return true;
}

}  // namespace client3::host
