// Fuzz target: the client library's reading of what the application sends back. A small stand-in
// application on loopback answers the handshake and then sends the input's bytes as the reply to
// one operation of the client, chosen by the input's first byte:
//
//   byte 0: bits 0-5 pick the operation, bit 6 sends the bytes as the hello reply instead, bit 7
//           sends them as they are (header included) instead of as one frame
//   the rest: the payload; a reply payload's request id is set to the one the client used, so that
//           the decoding goes on past it
//
// The stand-in closes its end after sending, so a frame cut short ends the call instead of waiting.
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <mutex>
#include <string>
#include <thread>
#include <condition_variable>

#include "platform/net.h"
#include "protocol/wire.h"
#include "ZarvoSDKClientCPP/ZarvoPelluxPostClient.h"

using namespace ZarvoSDKClientCPP;
using namespace client3;
using platform::Clock;
using platform::Socket;

namespace {

// What the stand-in sends on its next connection.
struct Script {
  std::mutex lock;
  std::condition_variable changed;
  std::string bytes;
  bool asHello = false, raw = false, ready = false;
};

std::string Frame(std::string_view payload) {
  auto size = static_cast<std::uint32_t>(payload.size());
  std::string frame(reinterpret_cast<const char*>(&size), sizeof size);
  return frame.append(payload);
}

bool ReadFrame(Socket& socket, std::string& payload) {
  std::uint32_t size;
  auto deadline = Clock::now() + std::chrono::seconds(5);
  if (socket.ReceiveAll(reinterpret_cast<char*>(&size), sizeof size, deadline) != platform::Io::Done) return false;
  if (size > protocol::kMaxFrame) return false;
  payload.resize(size);
  return socket.ReceiveAll(payload.data(), size, deadline) == platform::Io::Done;
}

void Serve(Socket& listener, Script& script) {
  for (;;) {
    Socket client = listener.Accept(std::chrono::seconds(3600));
    if (!client.valid()) continue;
    std::unique_lock<std::mutex> lock(script.lock);
    script.changed.wait(lock, [&] { return script.ready; });
    script.ready = false;
    std::string payload;
    if (!ReadFrame(client, payload)) continue;
    std::string out = script.bytes;
    if (!script.asHello) {
      protocol::Writer hello(protocol::Hello);
      hello.Raw(protocol::kVersion);
      hello.Raw(static_cast<std::uint16_t>(protocol::kCommandCount));
      std::string_view frame = hello.Finish();
      client.SendAll(frame.data(), frame.size());
      if (!ReadFrame(client, payload) || payload.size() < 5) continue;
      if (!script.raw && out.size() >= 5 && out[0] == protocol::Reply) std::memcpy(out.data() + 1, payload.data() + 1, 4);
    }
    if (!script.raw) out = Frame(out);
    client.SendAll(out.data(), out.size());
  }
}

Script script;
int port = 0;

void Start() {
  std::string error;
  static Socket listener = Socket::Listen("127.0.0.1", 0, error);
  port = listener.LocalPort();
  std::thread(Serve, std::ref(listener), std::ref(script)).detach();
}

// One operation of each kind of record the replies fill.
void Call(ZarvoPelluxPostClient& client, unsigned which) {
  std::vector<Type_Parameter> parameters;
  switch (which % 16) {
    case 0: client.GetFrameCount(); break;
    case 1: client.GetCommandList(); break;
    case 2: client.GetCommandInfo("GetTrajectory"); break;
    case 3: client.ProcessRequest("GetFrameCount", parameters); break;
    case 4: client.GetSubjectNames(); break;
    case 5: client.GetTrajectory("Alice", "LANK"); break;
    case 6: client.GetTrajectoryAtFrame("Alice", "LANK", 1); break;
    case 7: client.GetSubjectParamDetails("Alice", "", "Height"); break;
    case 8: client.GetConstraintDetails("Alice", "", "C1"); break;
    case 9: client.SceneGetObjectList("Marker"); break;
    case 10: client.ObjectGetAttributeValue(1, "Translation"); break;
    case 11: client.ObjectGetAttributes(1); break;
    case 12: client.TimelineGetSelectedRanges(); break;
    case 13: client.TimelineGetFrameRate(); break;
    case 14: client.OfflineGetReconstructSettings(); break;
    default: client.OfflineGetLabelingSubjectCalibrationSettings(); break;
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const bool started = (Start(), true);
  (void)started;
  if (size == 0) return 0;
  {
    std::lock_guard<std::mutex> lock(script.lock);
    script.bytes.assign(reinterpret_cast<const char*>(data) + 1, size - 1);
    script.asHello = data[0] & 0x40;
    script.raw = data[0] & 0x80;
    script.ready = true;
  }
  script.changed.notify_one();
  ZarvoPelluxPostClient client;
  Output_Result connected = client.Connect("127.0.0.1?timeout=5000&connect=5000", port);
  if (connected.Result == ResultCode::Success) Call(client, data[0] & 0x3f);
  client.Disconnect();
  return 0;
}
