#include "host/handlers.h"

namespace client3::host {

std::span<const HandlerEntry> FileHandlers() { return {}; }

}  // namespace client3::host
