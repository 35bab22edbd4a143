// Files and directories for the host. Paths are UTF-8 on every system.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace client3::platform {

// Reads a whole file of at most `limit` bytes; false when it cannot be read or is larger.
bool ReadFile(const std::string& path, std::string& contents, std::uintmax_t limit);
// Writes `contents` to a new file beside `path` and then puts it in the place of `path` in one step
// (ReplaceFile): a reader sees the old file or the new one, never a part. False on any failure, and
// then `path` is as it was.
bool WriteFileAtomically(const std::string& path, const std::string& contents);

// What a path names, looked at without following a link: a link is Link whatever it points to (on
// Windows every reparse point, junctions included, counts as a link).
enum class FileKind { Missing, File, Directory, Link, Other };
FileKind KindOf(const std::string& path);

// Creates one directory whose parent exists; false when it exists already or cannot be made.
bool MakeDirectory(const std::string& path);

struct DirectoryEntry {
  std::string name;
  FileKind kind;
};
// The entries of a directory (not "." and ".."), sorted by name; false when it cannot be read.
bool ListDirectory(const std::string& path, std::vector<DirectoryEntry>& entries);

// The absolute form of an existing path with every link resolved; empty when it does not exist.
std::string FullPath(const std::string& path);

// The separator that joins a directory and a name: '\\' on Windows, '/' elsewhere.
#ifdef _WIN32
inline constexpr char kSeparator = '\\';
#else
inline constexpr char kSeparator = '/';
#endif

}  // namespace client3::platform
