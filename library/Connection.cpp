// The transport of the client library.
#include "library/Connection.h"

#include <charconv>
#include <cstdlib>
#include <cstring>

namespace ZarvoSDKClientCPP {

using client3::platform::Clock;
using client3::platform::Io;
using namespace client3::protocol;

char const* ResultText(int code) {
  switch (code) {
    case ResultCode::Success: return "OK";
    case ResultCode::NotConnected: return "Unable to communicate with the host application.";
    case ResultCode::RequestTimedOut: return "Host application failed to respond to the information request.";
    case ResultCode::ReplyParsingError: return "Unable to interpret information sent from the host application.";
    case ResultCode::ApplicationError: return "Host application encountered an error processing the request.";
    case ResultCode::InvalidFrameNumber: return "Frame number specified is invalid.";
    case ResultCode::ConversionError: return "Unable to convert output parameter to a numeric value.";
    case ResultCode::ExpectedOneFrame: return "Invalid number of frames returned, expected one frame.";
    default: return "Unknown Error";
  }
}

namespace {

// The codes a reply may carry; any other is a status this library does not know.
ResultCode::Enum Known(std::int32_t code) {
  switch (code) {
    case ResultCode::Success:
    case ResultCode::NotConnected:
    case ResultCode::RequestTimedOut:
    case ResultCode::ReplyParsingError:
    case ResultCode::ApplicationError:
    case ResultCode::InvalidFrameNumber:
    case ResultCode::ConversionError:
    case ResultCode::ExpectedOneFrame:
      return static_cast<ResultCode::Enum>(code);
    default:
      return ResultCode::UnknownStatus;
  }
}

// "host?timeout=MS&connect=MS&token=TEXT": the host name, the two time limits and the access token
// (by default the environment variable CLIENT3_TOKEN, else none).
struct Address {
  std::string host = "127.0.0.1";
  std::chrono::milliseconds connect = kConnectTimeout;
  std::chrono::milliseconds reply = kReplyTimeout;
  std::string token;
};

// A whole non-negative number of milliseconds.
bool ParseMilliseconds(std::string_view text, std::chrono::milliseconds& out) {
  long long ms = -1;
  auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), ms);
  if (text.empty() || error != std::errc() || end != text.data() + text.size() || ms < 0) return false;
  out = std::chrono::milliseconds(ms);
  return true;
}

// Reads `text` into `out`; the reason it is not an address, or empty when it is one. Of the values,
// only a time limit's is repeated in the reason: another could be a token.
std::string ParseAddress(std::string const& text, Address& out) {
  if (const char* token = std::getenv("CLIENT3_TOKEN")) out.token = token;
  std::size_t query = text.find('?');
  std::string host = text.substr(0, query);
  if (!host.empty()) out.host = host;
  if (!out.host.empty() && out.host.front() == '[' && out.host.back() == ']') out.host = out.host.substr(1, out.host.size() - 2);
  while (query != std::string::npos) {
    std::size_t next = text.find('&', query + 1);
    std::string option = text.substr(query + 1, next == std::string::npos ? std::string::npos : next - query - 1);
    std::size_t equals = option.find('=');
    std::string key = option.substr(0, equals);
    if (key != "token" && key != "timeout" && key != "connect")
      return "'" + key + "' is not an address option (they are timeout=MS, connect=MS and token=TEXT)";
    if (equals == std::string::npos) return "the address option '" + key + "' has no value";
    std::string_view value = std::string_view(option).substr(equals + 1);
    if (key == "token")
      out.token = value;
    else if (!ParseMilliseconds(value, key == "timeout" ? out.reply : out.connect))
      return "the address option '" + key + "' takes a whole number of milliseconds, not '" + std::string(value) + "'";
    query = next;
  }
  return {};
}

// "host:port", with an IPv6 address in brackets.
std::string Place(std::string const& host, int port) {
  bool v6 = host.find(':') != std::string::npos;
  return (v6 ? "[" + host + "]" : host) + ":" + std::to_string(port);
}

}  // namespace

ClientConnection::Call::Call(ClientConnection& connection, Id id)
    : lock_(connection.mutex_), connection_(connection), command_(id) {}

// Buffers that one large request or reply grew are let go before the connection is unlocked.
ClientConnection::Call::~Call() {
  connection_.request_.Trim();
  client3::protocol::Trim(connection_.reply_);
}

bool ClientConnection::Call::Begin() {
  if (!connection_.socket_.valid()) return false;
  id_ = ++connection_.lastId_;
  Writer& w = connection_.request_;
  w.Clear(Request);
  w.Raw(id_);
  w.Raw(static_cast<std::uint16_t>(command_));
  return true;
}

ResultCode::Enum ClientConnection::Lost() {
  socket_.Close();
  return ResultCode::NotConnected;
}

// Reads one frame into reply_.
ResultCode::Enum ClientConnection::Receive(Clock::time_point deadline) {
  char header[kHeaderSize];
  Io io = socket_.ReceiveAll(header, sizeof header, deadline);
  if (io == Io::TimedOut) return ResultCode::RequestTimedOut;
  if (io != Io::Done) return HalfFrame(io);
  std::uint32_t size;
  std::memcpy(&size, header, sizeof size);
  if (size == 0 || size > kMaxFrame) {
    // The stream can no longer be followed.
    socket_.Close();
    return ResultCode::ReplyParsingError;
  }
  io = socket_.ReceiveGrowing(reply_, size, deadline);
  return io == Io::Done ? ResultCode::Success : HalfFrame(io);
}

// Part of a frame: the rest could no longer be told apart from the next reply.
ResultCode::Enum ClientConnection::HalfFrame(Io io) {
  socket_.Close();
  return io == Io::Closed ? ResultCode::NotConnected : ResultCode::RequestTimedOut;
}

ResultCode::Enum ClientConnection::Call::Exchange(std::string& message) {
  ClientConnection& c = connection_;
  if (!c.socket_.valid()) return ResultCode::NotConnected;
  std::string_view frame = c.request_.Finish();
  if (frame.size() - kHeaderSize > kMaxFrame) {
    message = "the request takes " + std::to_string(frame.size() - kHeaderSize) + " bytes, more than the application accepts (" +
              std::to_string(kMaxFrame) + ")";
    return ResultCode::ApplicationError;
  }
  if (!c.socket_.SendAll(frame.data(), frame.size())) return c.Lost();
  Clock::time_point deadline =
      c.replyTimeout_.count() ? Clock::now() + c.replyTimeout_ : Clock::time_point::max();
  for (;;) {
    if (ResultCode::Enum code = c.Receive(deadline); code != ResultCode::Success) return code;
    try {
      Reader reader(c.reply_.data(), c.reply_.size());
      auto kind = reader.Raw<char>();
      if (kind == Refusal) {
        message = reader.RawText();
        c.socket_.Close();
        return ResultCode::ApplicationError;
      }
      if (kind != Reply) return ResultCode::ReplyParsingError;
      auto id = reader.Raw<std::uint32_t>();
      // A reply to an earlier request that gave up waiting: passed over.
      if (id < id_) continue;
      if (id != id_) return ResultCode::ReplyParsingError;
      auto code = reader.Raw<std::int32_t>();
      message = reader.RawText();
      outputsAt_ = c.reply_.size() - reader.remaining();
      return Known(code);
    } catch (const DecodeError&) {
      return ResultCode::ReplyParsingError;
    }
  }
}

// A failed Connect's text is the code's own, then where it tried and why it failed there.
ResultCode::Enum ClientConnection::Open(std::string const& text, int port, std::string& message) {
  std::lock_guard<std::mutex> lock(mutex_);
  socket_.Close();
  Address address;
  std::string problem = ParseAddress(text, address);
  if (port <= 0) port = kDefaultPort;
  std::string place = Place(address.host, port);
  auto fail = [&](ResultCode::Enum code, std::string const& why) {
    socket_.Close();
    message = std::string(ResultText(code)) + " " + place + " " + why;
    return code;
  };
  if (!problem.empty()) return fail(ResultCode::NotConnected, "was not tried: " + problem);
  if (port > 65535)
    return fail(ResultCode::NotConnected, "was not tried: a port is a number from 1 to 65535 (0 or less for " + std::to_string(kDefaultPort) + ")");
  std::string waited = std::to_string(address.connect.count()) + " ms";
  client3::platform::ConnectFailure failure;
  socket_ = client3::platform::Socket::Connect(address.host, port, address.connect, failure);
  switch (failure.cause) {
    case client3::platform::ConnectFailure::None: break;
    case client3::platform::ConnectFailure::NameNotFound: return fail(ResultCode::NotConnected, "was not found: no host has that name");
    case client3::platform::ConnectFailure::Lookup: return fail(ResultCode::NotConnected, "could not be looked up: " + failure.detail);
    case client3::platform::ConnectFailure::Refused: return fail(ResultCode::NotConnected, "refused the connection");
    case client3::platform::ConnectFailure::TimedOut: return fail(ResultCode::NotConnected, "did not answer within " + waited);
    case client3::platform::ConnectFailure::Other: return fail(ResultCode::NotConnected, "could not be reached: " + failure.detail);
  }
  replyTimeout_ = address.reply;

  Writer& hello = request_;
  hello.Clear(Hello);
  hello.Append(kMagic, sizeof kMagic);
  hello.Raw(kVersion);
  hello.Raw(static_cast<std::uint16_t>(kCommandCount));
  hello.RawText(address.token);
  std::string_view frame = hello.Finish();
  // A hello that cannot be sent is not the end: the application may have refused the client and
  // closed already, and its refusal is still to be read.
  socket_.SendAll(frame.data(), frame.size());
  switch (Receive(Clock::now() + address.connect)) {
    case ResultCode::Success: break;
    case ResultCode::NotConnected: return fail(ResultCode::NotConnected, "closed the connection without answering");
    case ResultCode::ReplyParsingError: return fail(ResultCode::ReplyParsingError, "does not speak the application's protocol");
    default: return fail(ResultCode::NotConnected, "took the connection but did not answer within " + waited);
  }
  try {
    Reader reader(reply_.data(), reply_.size());
    auto kind = reader.Raw<char>();
    if (kind == Refusal) return fail(ResultCode::ApplicationError, "refused the client: " + std::string(reader.RawText()));
    if (kind != Hello) throw DecodeError("");
    auto version = reader.Raw<std::uint16_t>(), commands = reader.Raw<std::uint16_t>();
    if (version != kVersion || commands != kCommandCount)
      return fail(ResultCode::ReplyParsingError, "speaks version " + std::to_string(version) + " of the protocol with " +
                                                     std::to_string(commands) + " commands, not version " +
                                                     std::to_string(kVersion) + " with " + std::to_string(kCommandCount));
  } catch (const DecodeError&) {
    return fail(ResultCode::ReplyParsingError, "does not speak the application's protocol");
  }
  message.clear();
  return ResultCode::Success;
}

void ClientConnection::Close() {
  std::lock_guard<std::mutex> lock(mutex_);
  socket_.Close();
}

bool ClientConnection::Connected() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return socket_.valid() && !socket_.PeerClosed();
}

}  // namespace ZarvoSDKClientCPP
