// Look-ups and checks shared by the handlers. Each refuses with a message that names what is missing
// or wrong: objects by id ("object N has no channel with id M"), subjects and the like by name.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "host/scene/failure.h"
#include "host/scene/scene.h"

namespace client3::host {

Object& ObjectOf(Scene& scene, ObjectId id);
Object& SubjectOf(Scene& scene, std::string_view name);
Attribute& AttributeOf(Object& object, std::string_view name);
Attribute& AttributeOf(Object& object, ObjectId id);
Channel& ChannelOf(Object& object, ObjectId id);

// A frame number of the take as an index into its per-frame arrays; InvalidFrameNumber outside it.
std::size_t FrameIndex(const Scene& scene, int frame);

// Refuses any options: none are defined in this version.
void NoOptions(std::string_view command, std::string_view options);

// A selection mode: 0 replace, 1 add, 2 remove, 3 toggle.
enum class SelectMode { Replace = 0, Add = 1, Remove = 2, Toggle = 3 };
SelectMode ModeOf(int mode);
// Applies a selection mode to per-item flags: `chosen` are the items the command names.
void ApplyMode(std::vector<bool>& selected, const std::vector<bool>& chosen, SelectMode mode);

// A count and its noun, for the one-line summaries of stages and filters: "1 gap", "3 gaps".
std::string Count(std::size_t n, std::string_view one, std::string_view many = {});

}  // namespace client3::host
