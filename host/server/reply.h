// A reply as the application makes it: the request's number, the result code and the message, then
// the command's outputs.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "host/scene/failure.h"
#include "platform/net.h"
#include "protocol/wire.h"

namespace client3::host {

// Sends a whole frame.
inline void Send(platform::Socket& socket, protocol::Writer& frame) {
  std::string_view bytes = frame.Finish();
  socket.SendAll(bytes.data(), bytes.size());
}

class Reply {
 public:
  // Starts the reply to request `request`: Ok, no message, and the outputs to follow in `frame()`.
  void Start(std::uint32_t request) {
    request_ = request;
    Header(Ok, "");
  }
  // Makes it the reply of a refused command: its result code and why, without outputs.
  void Refuse(Status status, std::string_view message) { Header(status, message); }
  // Puts `message` in front of the outputs written so far (a stage's or a filter's summary).
  void Say(std::string_view message) {
    std::string outputs(frame_.Finish().substr(protocol::kHeaderSize + outputsAt_));
    Header(Ok, message);
    frame_.Append(outputs.data(), outputs.size());
  }

  protocol::Writer& frame() { return frame_; }
  bool ok() const { return ok_; }
  // Where the outputs start in the payload.
  std::size_t outputsAt() const { return outputsAt_; }
  // Lets go of the buffer when one large reply grew it.
  void Trim() { frame_.Trim(); }

 private:
  void Header(Status status, std::string_view message) {
    frame_.Clear(protocol::Reply);
    frame_.Raw(request_);
    frame_.Raw(static_cast<std::int32_t>(status));
    frame_.RawText(message);
    outputsAt_ = frame_.size() - protocol::kHeaderSize;
    ok_ = status == Ok;
  }

  protocol::Writer frame_;
  std::uint32_t request_ = 0;
  std::size_t outputsAt_ = 0;
  bool ok_ = true;
};

}  // namespace client3::host
