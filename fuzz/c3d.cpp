// Fuzz target: the host's C3D reader on one file's bytes, then the writer on the take it read and
// the reader again on what the writer wrote. A file the reader refuses must come back as a Failure;
// the take read back must have the frames, points, seen samples and analog samples written. Anything
// else that escapes, a take that changes on the way, or any sanitizer report is a finding.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string_view>

#include "host/files/c3d.h"
#include "host/scene/failure.h"

using namespace client3::host;

namespace {

bool Same(const c3d::Take& a, const c3d::Take& b) {
  if (a.frames != b.frames || a.points.size() != b.points.size() || a.analog.size() != b.analog.size()) return false;
  for (std::size_t p = 0; p < a.points.size(); ++p)
    if (a.points[p].seen != b.points[p].seen) return false;
  for (std::size_t c = 0; c < a.analog.size(); ++c) {
    std::vector<float> one = a.samples.Channel(a.analog[c].column), other = b.samples.Channel(b.analog[c].column);
    if (one.size() != other.size() || std::memcmp(one.data(), other.data(), one.size() * sizeof(float)) != 0) return false;
  }
  return true;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  c3d::Take take;
  try {
    take = c3d::Read(std::string(reinterpret_cast<const char*>(data), size));
  } catch (const Failure&) {
    return 0;
  }
  try {
    if (!Same(take, c3d::Read(c3d::Write(take)))) std::abort();
  } catch (const Failure&) {
    // A take that a C3D file cannot hold (a coordinate beyond the float range in millimetres).
  }
  return 0;
}
