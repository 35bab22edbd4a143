#include "platform/files.h"

#include <atomic>
#include <filesystem>
#include <fstream>
#include <system_error>

#include "platform/net.h"

namespace client3::platform {

namespace {

std::filesystem::path Native(const std::string& path) {
  return std::filesystem::path(std::u8string(reinterpret_cast<const char8_t*>(path.data()), path.size()));
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
  std::string temporary = path + ".partial" + std::to_string(serial++);
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

}  // namespace client3::platform
