#include "host/files/access.h"

#include "host/scene/failure.h"
#include "platform/files.h"

namespace client3::host {

namespace {

std::vector<std::string>& Roots() {
  static std::vector<std::string> roots;
  return roots;
}

bool IsSeparator(char c) { return c == '/' || c == platform::kSeparator; }

bool Inside(const std::string& full, const std::string& root) {
  if (full.compare(0, root.size(), root) != 0) return false;
  return full.size() == root.size() || IsSeparator(root.back()) || IsSeparator(full[root.size()]);
}

// A path that cannot be shown to lie inside: the same answer whether or not it exists, so that
// nothing outside can be probed.
[[noreturn]] void Outside(const std::string& path) { Refuse("'" + path + "' is not inside the directories the application may use"); }

}  // namespace

bool ConfineFiles(const std::vector<std::string>& directories, std::string& bad) {
  for (const std::string& directory : directories) {
    std::string full = platform::FullPath(directory);
    if (full.empty() || platform::KindOf(full) != platform::FileKind::Directory) return bad = directory, false;
    Roots().push_back(full);
  }
  return true;
}

std::string FilePlace(const std::string& path) {
  if (Roots().empty()) return path;
  std::string full = platform::FullPath(path);
  if (full.empty()) {
    // Not there yet: its directory must be, and its own name must be a plain one.
    std::size_t cut = path.size();
    while (cut > 0 && !IsSeparator(path[cut - 1])) --cut;
    std::string name = path.substr(cut);
    std::string directory = platform::FullPath(cut == 0 ? "." : path.substr(0, cut));
    bool drive = platform::kSeparator == '\\' && name.find(':') != std::string::npos;  // "C:name", "name:stream"
    if (name.empty() || name == "." || name == ".." || drive || directory.empty()) Outside(path);
    full = directory + (IsSeparator(directory.back()) ? "" : std::string(1, platform::kSeparator)) + name;
  }
  for (const std::string& root : Roots())
    if (Inside(full, root)) return full;
  Outside(path);
}

}  // namespace client3::host
