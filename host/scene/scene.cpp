// The scene's object tree and its timeline.
#include "host/scene/scene.h"

#include <algorithm>
#include <atomic>
#include <cmath>
#include <functional>

namespace client3::host {

ObjectId NewId() {
  static std::atomic<ObjectId> next{1};
  return next++;
}

// ---- Channels, objects ----------------------------------------------------------------------------

void Channel::Resize(int frames) {
  auto n = static_cast<std::size_t>(frames);
  values.assign(n, 0), keys.assign(n, false), selected.assign(n, false);
}

template <class T, class Key>
T* FindIn(std::vector<T>& list, Key key) {
  for (T& item : list) {
    if constexpr (std::is_same_v<Key, ObjectId>) {
      if (item.id == key) return &item;
    } else if (item.name == key) {
      return &item;
    }
  }
  return nullptr;
}

Attribute* Object::FindAttribute(std::string_view name) { return FindIn(attributes, name); }
Attribute* Object::FindAttribute(ObjectId id) { return FindIn(attributes, id); }
Channel* Object::FindChannel(std::string_view name) { return FindIn(channels, name); }
Channel* Object::FindChannel(ObjectId id) { return FindIn(channels, id); }
Parameter* Object::FindParameter(std::string_view name) { return FindIn(parameters, name); }
Parameter* Object::FindParameter(ObjectId id) { return FindIn(parameters, id); }

const std::string& Object::Text(std::string_view attribute) const {
  for (const Attribute& a : attributes)
    if (a.name == attribute) return a.value;
  static const std::string none;
  return none;
}

// ---- Time -------------------------------------------------------------------------------------------

bool SupportedFrameRate(double rate) {
  return rate >= 1 && rate <= kMaxFrameRate && rate == std::floor(rate) && kTicksPerSecond % static_cast<std::uint64_t>(rate) == 0;
}

bool TimelineHolds(double rate) { return rate >= kMinTakeRate && rate <= kMaxTakeRate; }

namespace {

// ceil(n x 2^shift / m), exactly: long division, one bit of the shift at a time.
std::uint64_t CeilShiftedQuotient(std::uint64_t n, int shift, std::uint64_t m) {
  std::uint64_t q = n / m, r = n % m;
  for (int i = 0; i < shift; ++i) {
    q <<= 1, r <<= 1;
    if (r >= m) ++q, r -= m;
  }
  return q + (r != 0);
}

}  // namespace

// The rate is m x 2^e with m odd, so (F - 1) x kTicksPerSecond / rate = (F - 1) x kTicksPerSecond x
// 2^-e / m: a whole-number division (e >= 0) or a shifted one (e < 0), both exact in 64 bits for
// the rates and frame counts a take may have.
std::uint64_t Timeline::TicksOf(int frame) const {
  std::uint64_t n = static_cast<std::uint64_t>(frame - 1) * kTicksPerSecond;
  int e;
  auto m = static_cast<std::uint64_t>(std::ldexp(std::frexp(rate, &e), 53));
  for (e -= 53; m != 0 && m % 2 == 0; m /= 2) ++e;
  if (e >= 0) return (n + (m << e) - 1) / (m << e);
  return CeilShiftedQuotient(n, -e, m);
}

int Timeline::FrameAt(std::uint64_t time) const {
  double estimate = std::floor(static_cast<double>(time) * rate / static_cast<double>(kTicksPerSecond));
  int frame = static_cast<int>(std::min(estimate, 1e9)) + 1;
  while (frame > 1 && TicksOf(frame) > time) --frame;
  while (TicksOf(frame + 1) <= time) ++frame;
  return frame;
}

std::uint64_t Timeline::Now() const {
  if (!playing) return ticks;
  auto elapsed = std::chrono::duration_cast<std::chrono::nanoseconds>(std::chrono::steady_clock::now() - playedFrom).count();
  auto advanced = static_cast<std::uint64_t>(static_cast<double>(elapsed) * static_cast<double>(rate) / 1e9);
  auto length = static_cast<std::uint64_t>(playEnd - playStart + 1);
  auto offset = static_cast<std::uint64_t>(FrameAt(ticks) - playStart);
  return TicksOf(playStart + static_cast<int>((offset + advanced) % length));
}

void Timeline::Set(std::uint64_t time) {
  ticks = time;
  playedFrom = std::chrono::steady_clock::now();
}

// ---- The tree -------------------------------------------------------------------------------------

bool KnownType(std::string_view type) {
  return std::find(std::begin(kObjectTypes), std::end(kObjectTypes), type) != std::end(kObjectTypes);
}

bool Computed(std::string_view attribute) {
  for (std::string_view name : {"Name", "Type", "WorldTranslation", "Rate", "Samples"})
    if (attribute == name) return true;
  return false;
}

bool MayContain(std::string_view parent, std::string_view child) {
  if (parent == "Scene") return child == "Subject" || child == "Camera" || child == "Clip" || child == "Null" || child == "Analog";
  if (parent == "Subject") return child == "Marker" || child == "Bone" || child == "Constraint";
  if (parent == "Bone") return child == "Bone" || child == "Null";
  if (parent == "Null") return child == "Null";
  return false;
}

std::string BadName(std::string_view name) {
  if (name.empty()) return "a name cannot be empty";
  for (char c : name)
    if (c == '/' || static_cast<unsigned char>(c) < 0x20)
      return "a name cannot hold '/' or control characters: '" + std::string(name) + "'";
  return {};
}

Scene::Scene(int frameCount, std::string name) : frames(frameCount) {
  Object root;
  root.id = this->root = NewId();
  root.type = "Scene";
  root.name = std::move(name);
  root.attributes.push_back({NewId(), "Name", ValueType::String, true, ""});
  root.attributes.push_back({NewId(), "Type", ValueType::String, false, ""});
  objects.emplace(root.id, std::move(root));
  timeline.playEnd = timeline.animEnd = frames;
  timeline.selected.assign(static_cast<std::size_t>(frames), false);
}

Object* Scene::Find(ObjectId id) {
  auto found = objects.find(id);
  return found == objects.end() ? nullptr : &found->second;
}

Object* Scene::Child(const Object& parent, std::string_view name) {
  for (ObjectId child : parent.children)
    if (Object& o = objects.at(child); o.name == name) return &o;
  return nullptr;
}

std::string Scene::PathOf(ObjectId id) {
  if (id == root) return "/";
  std::string path;
  for (Object* o = Find(id); o && o->id != root; o = Find(o->parent)) path = "/" + o->name + path;
  return path;
}

Object* Scene::AtPath(std::string_view path) {
  if (path.empty() || path[0] != '/') return nullptr;
  Object* at = &Root();
  path.remove_prefix(1);
  while (at && !path.empty()) {
    std::size_t slash = path.find('/');
    at = Child(*at, path.substr(0, slash));
    path = slash == std::string_view::npos ? std::string_view() : path.substr(slash + 1);
    if (slash != std::string_view::npos && path.empty()) return nullptr;
  }
  return at;
}

std::vector<ObjectId> Scene::Descendants(ObjectId id) {
  std::vector<ObjectId> out;
  std::function<void(ObjectId)> walk = [&](ObjectId parent) {
    for (ObjectId child : objects.at(parent).children) out.push_back(child), walk(child);
  };
  walk(id);
  return out;
}

bool Scene::IsBelow(ObjectId id, ObjectId ancestor) {
  for (Object* o = Find(id); o && o->parent; o = Find(o->parent))
    if (o->parent == ancestor) return true;
  return false;
}

Object& Scene::Add(ObjectId parent, std::string type, std::string name) {
  Object o;
  o.id = NewId();
  o.parent = parent;
  o.type = std::move(type);
  o.name = std::move(name);
  auto attribute = [&](std::string_view n, ValueType t, bool editable, std::string value) {
    o.attributes.push_back({NewId(), std::string(n), t, editable, std::move(value)});
  };
  attribute("Name", ValueType::String, true, "");
  attribute("Type", ValueType::String, false, "");
  if (o.type == "Subject") {
    attribute("Model", ValueType::String, true, o.name);
    attribute("Active", ValueType::Bool, true, "true");
  } else if (o.type == "Marker") {
    for (const char* axis : {"X", "Y", "Z"}) AddChannel(o, axis);
  } else if (o.type == "Bone" || o.type == "Null" || o.type == "Camera") {
    attribute("Translation", ValueType::Vector, true, "0,0,0");
    attribute("WorldTranslation", ValueType::Vector, false, "");
    if (o.type == "Camera") {
      int device = 1;
      for (Object* camera : OfType(Root(), "Camera")) device = std::max(device, std::stoi(camera->Text("DeviceID")) + 1);
      attribute("DeviceID", ValueType::Int, false, std::to_string(device));
      attribute("Enabled", ValueType::Bool, true, "true");
    }
  } else if (o.type == "Constraint") {
    attribute("Active", ValueType::Bool, true, "true");
    attribute("Source", ValueType::String, true, "");
    attribute("Target", ValueType::String, true, "");
    attribute("Offset", ValueType::Vector, true, "0,0,0");
    attribute("ConstraintType", ValueType::String, true, "Point");
  } else if (o.type == "Clip") {
    attribute("Description", ValueType::String, true, "");
  } else if (o.type == "Analog") {
    attribute("Description", ValueType::String, true, "");
    attribute("Unit", ValueType::String, true, "");
    attribute("Scale", ValueType::Float, false, "1");
    attribute("Offset", ValueType::Float, false, "0");
    attribute("Rate", ValueType::Float, false, "");
    attribute("Samples", ValueType::Int, false, "");
  }
  ObjectId id = o.id;
  objects.at(parent).children.push_back(id);
  return objects.emplace(id, std::move(o)).first->second;
}

Channel& Scene::AddChannel(Object& object, std::string name) {
  Channel c;
  c.id = NewId(), c.name = std::move(name);
  c.Resize(frames);
  return object.channels.emplace_back(std::move(c));
}

void Scene::Remove(ObjectId id) {
  std::vector<ObjectId> gone = Descendants(id);
  gone.push_back(id);
  auto& siblings = objects.at(objects.at(id).parent).children;
  siblings.erase(std::find(siblings.begin(), siblings.end(), id));
  for (ObjectId each : gone) {
    if (objects.at(each).type == "Analog") {
      analog.column.erase(each);
      std::erase_if(fileGroups, [](const c3d::Group& g) { return g.name == "FORCE_PLATFORM"; });
    }
    objects.erase(each);
    selection.erase(std::remove(selection.begin(), selection.end(), each), selection.end());
    if (activeClip == each) activeClip = 0;
  }
}

std::vector<double> Scene::WorldTranslation(ObjectId id) {
  std::vector<double> sum(3, 0.0);
  for (Object* o = Find(id); o; o = o->parent ? Find(o->parent) : nullptr)
    if (o->FindAttribute("Translation")) {
      std::vector<double> v = VectorOf(o->Text("Translation"));
      for (int i = 0; i < 3; ++i) sum[i] += v[i];
    }
  return sum;
}

std::vector<Object*> Scene::OfType(const Object& parent, std::string_view type) {
  std::vector<Object*> out;
  for (ObjectId child : parent.children)
    if (Object& o = objects.at(child); o.type == type) out.push_back(&o);
  return out;
}

Object* Scene::FindSubject(std::string_view name) {
  Object* o = Child(Root(), name);
  return o && o->type == "Subject" ? o : nullptr;
}

std::vector<Object*> Scene::Bones(const Object& subject) {
  std::vector<Object*> out;
  std::function<void(const Object&)> walk = [&](const Object& parent) {
    for (Object* bone : OfType(parent, "Bone")) out.push_back(bone), walk(*bone);
  };
  walk(subject);
  return out;
}

}  // namespace client3::host
