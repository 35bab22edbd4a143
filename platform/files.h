// Files and directories for the host. Paths are UTF-8 on every system.
#pragma once

#include <cstdint>
#include <string>

namespace client3::platform {

// Reads a whole file of at most `limit` bytes; false when it cannot be read or is larger.
bool ReadFile(const std::string& path, std::string& contents, std::uintmax_t limit);
// Writes `contents` to a new file beside `path` and then puts it in the place of `path` in one step
// (ReplaceFile): a reader sees the old file or the new one, never a part. False on any failure, and
// then `path` is as it was.
bool WriteFileAtomically(const std::string& path, const std::string& contents);

}  // namespace client3::platform
