// The heap string factory behind the library's owning SafeStrings.
#include <cstring>

#include "ZarvoSDKClientCPP/SafeString.h"

namespace ZarvoSDKClientCPP {

char* VStringFactory::Duplicate(char const* text) {
  if (!text) return nullptr;
  std::size_t size = std::strlen(text) + 1;
  char* copy = new char[size];
  std::memcpy(copy, text, size);
  return copy;
}

void VStringFactory::Release(char* text) { delete[] text; }

VStringFactory& VStringFactory::Instance() {
  static VStringFactory factory;
  return factory;
}

}  // namespace ZarvoSDKClientCPP
