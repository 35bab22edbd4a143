#include "platform/files.h"

#include <algorithm>
#include <atomic>
#include <filesystem>
#include <fstream>
#include <system_error>

#ifdef _WIN32
#ifndef WIN32_LEAN_AND_MEAN
#define WIN32_LEAN_AND_MEAN
#endif
#include <windows.h>
// <windows.h> names its own ReplaceFile as a macro for ReplaceFileA/W; ours keeps its name.
#undef ReplaceFile
#else
#include <dirent.h>
#include <sys/stat.h>
#include <sys/types.h>
#include <unistd.h>
#endif

#include "platform/net.h"

namespace client3::platform {

namespace {

std::filesystem::path Native(const std::string& path) {
  return std::filesystem::path(std::u8string(reinterpret_cast<const char8_t*>(path.data()), path.size()));
}

#ifdef _WIN32
std::wstring Wide(const std::string& text) {
  if (text.empty()) return {};
  int size = MultiByteToWideChar(CP_UTF8, MB_ERR_INVALID_CHARS, text.data(), static_cast<int>(text.size()), nullptr, 0);
  if (size <= 0) return {};
  std::wstring wide(static_cast<std::size_t>(size), L'\0');
  MultiByteToWideChar(CP_UTF8, MB_ERR_INVALID_CHARS, text.data(), static_cast<int>(text.size()), wide.data(), size);
  return wide;
}

std::string Narrow(const wchar_t* text) {
  int size = WideCharToMultiByte(CP_UTF8, 0, text, -1, nullptr, 0, nullptr, nullptr);
  if (size <= 1) return {};
  std::string narrow(static_cast<std::size_t>(size), '\0');
  WideCharToMultiByte(CP_UTF8, 0, text, -1, narrow.data(), size, nullptr, nullptr);
  narrow.pop_back();  // the terminating zero
  return narrow;
}

FileKind KindOfAttributes(DWORD attributes) {
  if (attributes & FILE_ATTRIBUTE_REPARSE_POINT) return FileKind::Link;
  if (attributes & FILE_ATTRIBUTE_DIRECTORY) return FileKind::Directory;
  return FileKind::File;
}
#else
FileKind KindOfMode(mode_t mode) {
  if (S_ISLNK(mode)) return FileKind::Link;
  if (S_ISDIR(mode)) return FileKind::Directory;
  if (S_ISREG(mode)) return FileKind::File;
  return FileKind::Other;
}
#endif

unsigned long ProcessId() {
#ifdef _WIN32
  return GetCurrentProcessId();
#else
  return static_cast<unsigned long>(getpid());
#endif
}

}  // namespace

bool ReadFile(const std::string& path, std::string& contents, std::uintmax_t limit) {
  std::error_code error;
  std::filesystem::path native = Native(path);
  if (!std::filesystem::is_regular_file(native, error)) return false;
  std::uintmax_t size = std::filesystem::file_size(native, error);
  if (error || size > limit) return false;
  std::ifstream in(native, std::ios::binary);
  contents.assign(static_cast<std::size_t>(size), '\0');
  return in.read(contents.data(), static_cast<std::streamsize>(size)) && in.gcount() == static_cast<std::streamsize>(size);
}

bool WriteFileAtomically(const std::string& path, const std::string& contents) {
  static std::atomic<unsigned> serial{0};
  // Named for this process and this write: two applications saving to one path at once each write
  // a file of their own, and the last to finish replaces the other's whole.
  std::string temporary = path + ".partial" + std::to_string(ProcessId()) + "-" + std::to_string(serial++);
  {
    std::ofstream out(Native(temporary), std::ios::binary | std::ios::trunc);
    if (!out || !out.write(contents.data(), static_cast<std::streamsize>(contents.size())) || !out.flush()) {
      out.close();
      std::error_code ignored;
      std::filesystem::remove(Native(temporary), ignored);
      return false;
    }
  }
  if (ReplaceFile(temporary, path)) return true;
  std::error_code ignored;
  std::filesystem::remove(Native(temporary), ignored);
  return false;
}

FileKind KindOf(const std::string& path) {
#ifdef _WIN32
  std::wstring wide = Wide(path);
  if (wide.empty()) return FileKind::Missing;
  DWORD attributes = GetFileAttributesW(wide.c_str());
  return attributes == INVALID_FILE_ATTRIBUTES ? FileKind::Missing : KindOfAttributes(attributes);
#else
  struct stat status {};
  if (path.empty() || lstat(path.c_str(), &status) != 0) return FileKind::Missing;
  return KindOfMode(status.st_mode);
#endif
}

bool MakeDirectory(const std::string& path) {
#ifdef _WIN32
  std::wstring wide = Wide(path);
  return !wide.empty() && CreateDirectoryW(wide.c_str(), nullptr) != 0;
#else
  return !path.empty() && mkdir(path.c_str(), 0777) == 0;
#endif
}

bool ListDirectory(const std::string& path, std::vector<DirectoryEntry>& entries) {
  entries.clear();
#ifdef _WIN32
  std::wstring pattern = Wide(path);
  if (pattern.empty()) return false;
  pattern += L"\\*";
  WIN32_FIND_DATAW found;
  HANDLE search = FindFirstFileW(pattern.c_str(), &found);
  if (search == INVALID_HANDLE_VALUE) return false;
  do {
    std::string name = Narrow(found.cFileName);
    if (!name.empty() && name != "." && name != "..") entries.push_back({name, KindOfAttributes(found.dwFileAttributes)});
  } while (FindNextFileW(search, &found));
  bool complete = GetLastError() == ERROR_NO_MORE_FILES;
  FindClose(search);
  if (!complete) return false;
#else
  DIR* directory = opendir(path.c_str());
  if (!directory) return false;
  while (const dirent* entry = readdir(directory)) {
    std::string name = entry->d_name;
    if (name == "." || name == "..") continue;
    struct stat status {};
    FileKind kind = lstat((path + "/" + name).c_str(), &status) == 0 ? KindOfMode(status.st_mode) : FileKind::Missing;
    if (kind != FileKind::Missing) entries.push_back({name, kind});
  }
  closedir(directory);
#endif
  std::sort(entries.begin(), entries.end(), [](const DirectoryEntry& a, const DirectoryEntry& b) { return a.name < b.name; });
  return true;
}

std::string FullPath(const std::string& path) {
  if (path.empty()) return {};
  std::error_code error;
  std::filesystem::path full = std::filesystem::canonical(Native(path), error);
  if (error) return {};
  std::u8string text = full.u8string();
  return std::string(text.begin(), text.end());
}

}  // namespace client3::platform
