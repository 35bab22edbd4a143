#include "host/commands/lookups.h"

namespace client3::host {

Object& ObjectOf(Scene& scene, ObjectId id) {
  if (Object* o = scene.Find(id)) return *o;
  Refuse("no object with id " + std::to_string(id));
}

Object& SubjectOf(Scene& scene, std::string_view name) {
  if (Object* s = scene.FindSubject(name)) return *s;
  Refuse("no subject named '" + std::string(name) + "'");
}

Attribute& AttributeOf(Object& object, std::string_view name) {
  if (Attribute* a = object.FindAttribute(name)) return *a;
  Refuse("object " + std::to_string(object.id) + " has no attribute named '" + std::string(name) + "'");
}

Attribute& AttributeOf(Object& object, ObjectId id) {
  if (Attribute* a = object.FindAttribute(id)) return *a;
  Refuse("object " + std::to_string(object.id) + " has no attribute with id " + std::to_string(id));
}

Channel& ChannelOf(Object& object, ObjectId id) {
  if (Channel* c = object.FindChannel(id)) return *c;
  Refuse("object " + std::to_string(object.id) + " has no channel with id " + std::to_string(id));
}

std::size_t FrameIndex(const Scene& scene, int frame) {
  if (frame < 1 || frame > scene.frames)
    throw Failure{BadFrame, "frame " + std::to_string(frame) + " is outside the take (1 to " + std::to_string(scene.frames) + ")"};
  return static_cast<std::size_t>(frame - 1);
}

void NoOptions(std::string_view command, std::string_view options) {
  if (!options.empty()) Refuse("'" + std::string(command) + "' takes no options: '" + std::string(options) + "'");
}

SelectMode ModeOf(int mode) {
  if (mode < 0 || mode > 3) Refuse("selection mode " + std::to_string(mode) + " is not one of 0 replace, 1 add, 2 remove, 3 toggle");
  return static_cast<SelectMode>(mode);
}

void ApplyMode(std::vector<bool>& selected, const std::vector<bool>& chosen, SelectMode mode) {
  for (std::size_t i = 0; i < selected.size(); ++i) {
    switch (mode) {
      case SelectMode::Replace: selected[i] = chosen[i]; break;
      case SelectMode::Add: selected[i] = selected[i] || chosen[i]; break;
      case SelectMode::Remove: selected[i] = selected[i] && !chosen[i]; break;
      case SelectMode::Toggle: selected[i] = selected[i] != chosen[i]; break;
    }
  }
}

std::string Count(std::size_t n, std::string_view one, std::string_view many) {
  std::string text = std::to_string(n) + " ";
  if (n == 1) return text.append(one);
  return many.empty() ? text.append(one).append(1, 's') : text.append(many);
}

}  // namespace client3::host
