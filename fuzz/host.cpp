// Fuzz target: the host's reading of one request payload, as a client's connection hands it over.
// The payload is decoded as the server does (kind, request id, command number), checked against the
// command's declaration and run against a fresh copy of a small demo scene. A refused command must
// come back as a Failure; anything else that escapes, or any sanitizer report, is a finding.
//
// Commands that touch the file system are left out, so that a run cannot write or remove files
// outside its own directory: their handlers share the path checks exercised by the tests instead.
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "host/scene/failure.h"
#include "host/scene/scene.h"
#include "host/server/dispatch.h"
#include "host/server/faults.h"

using namespace client3;
using protocol::Id;

namespace {

constexpr Id kFileCommands[] = {Id::AddScriptPath, Id::RemoveScriptPath, Id::ReparseScriptPaths, Id::LoadFile,
                                Id::ImportFile,    Id::SaveFile,         Id::ExportFile,         Id::DatabaseCreate,
                                Id::DatabaseGetCurrent, Id::DatabaseSetCurrent, Id::DatabaseGetMarkedTakes};

// Whether a request by name (or a command line) could name one of them.
bool NamesFileCommand(std::string_view text) {
  for (Id id : kFileCommands)
    if (text.find(protocol::CommandOf(id).name) != std::string_view::npos) return true;
  return false;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const host::Scene demo = host::DemoScene(20);
  static const host::Faults faults;
  protocol::Reader in(reinterpret_cast<const char*>(data), size);
  std::uint16_t command;
  try {
    if (in.Raw<char>() != protocol::Request) return 0;
    in.Raw<std::uint32_t>();
    command = in.Raw<std::uint16_t>();
  } catch (const protocol::DecodeError&) {
    return 0;
  }
  if (command >= protocol::kCommandCount) return 0;
  auto id = static_cast<Id>(command);
  for (Id file : kFileCommands)
    if (id == file) return 0;
  try {
    protocol::Validate(in, protocol::CommandOf(id).in);
  } catch (const protocol::DecodeError&) {
    return 0;
  }
  if (id == Id::ProcessRequest || id == Id::PSL) {
    protocol::Reader peek = in;
    if (NamesFileCommand(peek.Text())) return 0;
  }
  host::Scene scene = demo;
  std::string language = "en";
  host::Context context{scene, language, faults};
  protocol::Writer reply(protocol::Reply);
  try {
    host::Run(id, context, in, reply);
  } catch (const host::Failure&) {
  }
  return 0;
}
