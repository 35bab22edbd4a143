// A client's connection to the application: one socket, request ids, the reply timeout, and the
// exchange of one request for its reply.
#pragma once

#include <cstdint>
#include <mutex>
#include <string>
#include <vector>

#include "library/ResultText.h"
#include "platform/net.h"
#include "protocol/wire.h"
#include "ZarvoSDKClientCPP/ZarvoPelluxPostClient.h"

namespace ZarvoSDKClientCPP {


// How long Connect waits for the application, and how long a request waits for its reply, unless
// the address says otherwise ("host?timeout=MS&connect=MS").
inline constexpr int kDefaultPort = 8870;
inline constexpr std::chrono::milliseconds kConnectTimeout{5000};
inline constexpr std::chrono::milliseconds kReplyTimeout{30000};

class ClientConnection {
public:
  // One request under way: its frame is written between Begin and Exchange, and its reply's outputs
  // are read after. The connection stays locked for the whole exchange.
  class Call {
  public:
    client3::protocol::Writer& request() { return connection_.request_; }
    // Starts the request's frame, or returns false when there is no connection to send it on (its
    // arguments then need no writing).
    bool Begin();
    // Sends the request and waits for its reply. On Success, `outputs()` reads the reply's values;
    // `message` is the application's text: why it refused, or on success what the command did
    // (empty when it sent none).
    ResultCode::Enum Exchange(std::string& message);
    client3::protocol::Reader outputs() const { return {connection_.reply_.data() + outputsAt_, connection_.reply_.size() - outputsAt_}; }

    ~Call();
    Call(const Call&) = delete;

  private:
    friend class ClientConnection;
    Call(ClientConnection& connection, client3::protocol::Id id);
    std::lock_guard<std::mutex> lock_;
    ClientConnection& connection_;
    client3::protocol::Id command_;
    std::uint32_t id_ = 0;
    std::size_t outputsAt_ = 0;
  };

  Call Start(client3::protocol::Id id) { return Call(*this, id); }

  // Connects and shakes hands. On failure `message` is the code's text, then the address, the port
  // and the cause ("... 127.0.0.1:8870 refused the connection").
  ResultCode::Enum Open(std::string const& address, int port, std::string& message);
  void Close();
  bool Connected() const;

private:
  ResultCode::Enum Receive(client3::platform::Clock::time_point deadline);
  ResultCode::Enum Lost();
  ResultCode::Enum HalfFrame(client3::platform::Io io);

  mutable std::mutex mutex_;
  client3::platform::Socket socket_;
  std::uint32_t lastId_ = 0;
  std::chrono::milliseconds replyTimeout_ = kReplyTimeout;
  client3::protocol::Writer request_;
  std::vector<char> reply_;
};

}  // namespace ZarvoSDKClientCPP
