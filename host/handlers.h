// The handlers of the application's commands, in groups. Each group's file keeps a table of its
// handlers, one entry per command; commands.cpp combines the tables once at start-up into one
// handler per command number, and a command no group handles is refused as not available.
#pragma once

#include <span>
#include <string>

#include "host/commands.h"

namespace client3::host {

using Handler = void (*)(Context&, protocol::Reader&, protocol::Writer&);
struct HandlerEntry {
  protocol::Id id;
  Handler handler;
  Access access = Access::Write;
};

std::span<const HandlerEntry> SceneHandlers();     // connection, protocol, subjects (commands.cpp)
std::span<const HandlerEntry> ObjectHandlers();    // objects, attributes, channels, parameters (objects.cpp)
std::span<const HandlerEntry> FileHandlers();      // scenes and scene files (files.cpp)
std::span<const HandlerEntry> TimelineHandlers();  // timeline (timeline.cpp)
std::span<const HandlerEntry> SettingsHandlers();  // the processing settings (settings.cpp)
std::span<const HandlerEntry> FilterHandlers();    // the channel filters (filters.cpp)
std::span<const HandlerEntry> ProcessingHandlers(); // the processing stages (processing.cpp)
std::span<const HandlerEntry> InterchangeHandlers();  // importing and exporting trajectories (interchange.cpp)
std::span<const HandlerEntry> WorkspaceHandlers();    // script paths and the capture database (workspace.cpp)

// Lookups shared by the groups, refusing with a message that names what is missing.
Object& ObjectOf(Scene& scene, ObjectId id);
// A frame number of the take as an index into its per-frame arrays; InvalidFrameNumber outside it.
std::size_t FrameIndex(const Scene& scene, int frame);
// The canonical text of a selection mode: 0 replace, 1 add, 2 remove, 3 toggle.
enum class SelectMode { Replace = 0, Add = 1, Remove = 2, Toggle = 3 };
SelectMode ModeOf(int mode);
// Applies a selection mode to per-item flags: `chosen` are the items the command names.
void ApplyMode(std::vector<bool>& selected, const std::vector<bool>& chosen, SelectMode mode);

// A count and its noun, for the one-line summaries of stages and filters: "1 gap", "3 gaps".
inline std::string Count(std::size_t n, std::string_view one, std::string_view many = {}) {
  std::string text = std::to_string(n) + " ";
  if (n == 1) return text.append(one);
  return many.empty() ? text.append(one).append(1, 's') : text.append(many);
}

}  // namespace client3::host
