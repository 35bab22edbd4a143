// The application's scene: one take of motion-capture data held as a tree of objects.
//
// Every item of the scene is an object: the scene itself (the root), subjects, their markers, bones
// and constraints, cameras, clips, and plain objects that scripts create. An object has an id that
// is never used again within the application's life, a type, a name unique among its siblings, a
// parent and children, typed attributes, animation channels with keys, and parameters. Attributes,
// channels and parameters have ids from the same counter.
//
// A marker's trajectory is its channels X, Y and Z: a frame where all three hold a key is a frame
// where the marker was seen. A subject's parameters of kind Number are its subject parameters. An
// analog channel (a force plate's, an EMG electrode's) is an Analog object under the root; its
// samples are kept beside the tree (Scene::analog), since they are not one value a frame.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "host/files/c3d.h"
#include "host/scene/settings.h"
#include "host/scene/values.h"

namespace client3::host {

using ObjectId = std::uint64_t;

// The next id of the application's life: 1, 2, 3, ...
ObjectId NewId();

struct Attribute {
  ObjectId id = 0;
  std::string name;
  ValueType type = ValueType::String;
  bool editable = true;
  std::string value;  // canonical text; Name, Type and WorldTranslation are read from the object
};

// A scalar animated value: one slot per frame of the take, each holding a key or not.
struct Channel {
  ObjectId id = 0;
  std::string name;
  std::vector<double> values;  // the key's value where keys[i]; elsewhere what was last written there
  std::vector<bool> keys;
  std::vector<bool> selected;  // key selection; only frames with a key are selected
  double fallback = 0;         // the value read where there is no key to read from

  void Resize(int frames);
  void SetKey(std::size_t frame, double value) { values[frame] = value, keys[frame] = true; }
  void DeleteKey(std::size_t frame) { keys[frame] = false, selected[frame] = false; }
};

enum class ParameterKind : std::int32_t { Any = 0, Number = 1, Text = 2 };

struct Parameter {
  ObjectId id = 0;
  std::string name;
  ParameterKind kind = ParameterKind::Number;
  std::string value, fallback;  // canonical text: Floats for Number parameters
  std::string unit;
  bool required = false;
};

struct Object {
  ObjectId id = 0;
  std::string type;
  std::string name;
  ObjectId parent = 0;  // 0 for the scene root
  std::vector<ObjectId> children;
  std::vector<Attribute> attributes;
  std::vector<Channel> channels;
  std::vector<Parameter> parameters;

  Attribute* FindAttribute(std::string_view name);
  Attribute* FindAttribute(ObjectId id);
  Channel* FindChannel(std::string_view name);
  Channel* FindChannel(ObjectId id);
  Parameter* FindParameter(std::string_view name);
  Parameter* FindParameter(ObjectId id);
  // The stored text of an attribute this object certainly has.
  const std::string& Text(std::string_view attribute) const;
};

// Time: ticks, seconds and frames are views of one current time. Frame 1 is at time 0.
inline constexpr std::uint64_t kTicksPerSecond = 705'600'000;
inline constexpr int kMaxFrameRate = 10'000;
// Whether `rate` frames per second can be played with a whole number of ticks per frame: the rates
// that TimelineSetFrameRate takes.
bool SupportedFrameRate(double rate);
// Whether the timeline can hold `rate` at all: any rate from 0.001 to 1,000,000 frames per second
// (a take imported from a file keeps its own).
inline constexpr double kMinTakeRate = 1e-3, kMaxTakeRate = 1e6;
bool TimelineHolds(double rate);
// The time-code standards, by name.
inline constexpr std::string_view kTimeCodeStandards[] = {"Film", "PAL", "NTSC", "NTSCDrop", "HD50", "HD60"};

struct Timeline {
  double rate = 100;
  std::uint64_t ticks = 0;  // the current time while stopped, the time playback started from while playing
  int playStart = 1, playEnd = 1, animStart = 1, animEnd = 1;
  std::string standard = "PAL";
  bool playing = false;
  std::chrono::steady_clock::time_point playedFrom;
  std::vector<bool> selected;  // frames of the take that are selected

  // The current time: while playing, moved on by the time that has passed, frame by frame through
  // the play range and round again.
  std::uint64_t Now() const;
  // Frame F starts at the first whole tick at or after its exact time, (F - 1) x kTicksPerSecond /
  // rate, worked out exactly; a time lies in the last frame that starts at or before it. For a rate
  // that divides kTicksPerSecond every frame is the same whole number of ticks long.
  std::uint64_t TicksOf(int frame) const;
  int FrameAt(std::uint64_t time) const;
  // Sets the current time (playback, if on, goes on from there).
  void Set(std::uint64_t time);
};

// The samples of the take's analog channels: each channel's Analog object has its column of `data`
// (the file's own numbers, samplesPerFrame a frame). A channel's physical values are (sample - its
// Offset) x its Scale x generalScale.
struct AnalogSamples {
  c3d::AnalogData data;
  double generalScale = 1;
  std::unordered_map<ObjectId, std::size_t> column;
};

struct Scene {
  std::string path;  // the file it was loaded from or saved to
  int frames = 0;
  ObjectId root = 0;
  std::unordered_map<ObjectId, Object> objects;
  std::vector<ObjectId> selection;  // in the order the objects were selected
  ObjectId activeClip = 0;
  Timeline timeline;
  Settings settings;  // the processing stages' settings, kept with the scene
  AnalogSamples analog;
  // The groups of an imported C3D file that the application does not use (force platforms,
  // subjects, events, ...), written back when the take is exported.
  std::vector<c3d::Group> fileGroups;

  explicit Scene(int frames = 1, std::string name = "Untitled");

  Object& Root() { return objects.at(root); }
  const std::string& Name() const { return objects.at(root).name; }
  Object* Find(ObjectId id);
  Object* Child(const Object& parent, std::string_view name);
  std::string PathOf(ObjectId id);
  // "/" is the root, "/Alice/LFHD" a marker; an empty path names nothing.
  Object* AtPath(std::string_view path);
  // The objects below `id`, parents before their children, siblings in order.
  std::vector<ObjectId> Descendants(ObjectId id);
  bool IsBelow(ObjectId id, ObjectId ancestor);

  // Adds an object with the standard attributes and channels of its type; the caller has checked
  // the name and the parent.
  Object& Add(ObjectId parent, std::string type, std::string name);
  // Adds a channel with no keys to an object; the caller has checked the name.
  Channel& AddChannel(Object& object, std::string name);
  // Removes an object with its descendants (never the root); an Analog object's samples go with it,
  // and with them the file's FORCE_PLATFORM group, whose channel numbers no longer hold.
  void Remove(ObjectId id);
  // Sum of the Translation attributes from the root down to the object.
  std::vector<double> WorldTranslation(ObjectId id);

  // The subjects and their parts, in order.
  std::vector<Object*> OfType(const Object& parent, std::string_view type);
  Object* FindSubject(std::string_view name);
  std::vector<Object*> Bones(const Object& subject);  // the skeleton, parents before children
};

// The types of objects, and which may be the child of which.
inline constexpr std::string_view kObjectTypes[] = {"Scene", "Subject", "Marker", "Bone", "Constraint", "Camera", "Clip", "Null", "Analog"};
bool KnownType(std::string_view type);
// Whether an attribute's value is worked out from the object and the scene rather than stored:
// Name, Type, WorldTranslation, and an Analog object's Rate and Samples.
bool Computed(std::string_view attribute);
bool MayContain(std::string_view parentType, std::string_view childType);
// Why `name` cannot name an object; empty when it can.
std::string BadName(std::string_view name);
inline constexpr std::string_view kConstraintTypes[] = {"Point", "Aim", "Orient"};
// The channels that solving (T) and retargeting (R) give a bone: its position on each axis.
inline constexpr std::string_view kBoneChannels[] = {"TX", "TY", "TZ", "RX", "RY", "RZ"};

// The demonstration take: deterministic, smooth trajectories with a few occlusion gaps.
Scene DemoScene(int frames);
Scene EmptyScene(int frames);

}  // namespace client3::host
