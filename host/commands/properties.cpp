// The handlers of each object's attributes, its channels with their keys, and its parameters.
#include <algorithm>

#include "host/commands/command.h"
#include "host/commands/lookups.h"

namespace client3::host {

namespace {

Channel& ChannelOf(Scene& scene, protocol::Reader& in) {
  Object& o = ObjectOf(scene, in.Get<std::uint64_t>());
  return ChannelOf(o, in.Get<std::uint64_t>());
}

ParameterKind KindOf(int kind) {
  if (kind < 0 || kind > 2) Refuse("parameter kind " + std::to_string(kind) + " is not one of 0 any, 1 number, 2 text");
  return static_cast<ParameterKind>(kind);
}

bool OfKind(const Parameter& p, ParameterKind kind) { return kind == ParameterKind::Any || p.kind == kind; }

Parameter& ParameterOf(Object& o, ObjectId id, ParameterKind kind) {
  Parameter* p = o.FindParameter(id);
  if (!p || !OfKind(*p, kind))
    Refuse("object " + std::to_string(o.id) + " has no parameter with id " + std::to_string(id) + (kind == ParameterKind::Any ? "" : " of that kind"));
  return *p;
}

// An attribute's value as text: Name, Type and WorldTranslation are read from the object itself, an
// Analog object's Rate (samples a second) and Samples (its count) from the take.
std::string ValueOf(Scene& scene, Object& o, const Attribute& a) {
  if (a.name == "Name") return o.name;
  if (a.name == "Type") return o.type;
  if (a.name == "WorldTranslation") {
    std::vector<double> w = scene.WorldTranslation(o.id);
    return VectorText(w);
  }
  std::size_t perFrame = scene.analog.data.samplesPerFrame();
  if (a.name == "Rate") return NumberText(scene.timeline.rate * static_cast<double>(perFrame));
  if (a.name == "Samples") return std::to_string(static_cast<std::size_t>(scene.frames) * perFrame);
  return a.value;
}

void PutAttribute(protocol::Writer& out, ValueType type, bool editable, std::string_view text) {
  out.Put(static_cast<std::int32_t>(type));
  out.Put(editable);
  out.Put(text);
}

void SetAttribute(Scene& scene, Object& o, Attribute& a, std::string_view text) {
  if (!a.editable) Refuse("attribute '" + a.name + "' of object " + std::to_string(o.id) + " is read-only");
  std::optional<std::string> value = Canonical(a.type, text);
  if (!value)
    Refuse("'" + std::string(text) + "' is not a " + std::string(ValueTypeName(a.type)) + " value for attribute '" + a.name + "'");
  if (a.name == "Name") {
    if (o.id == scene.root) {
      if (value->empty()) Refuse("a scene name cannot be empty");
    } else {
      if (std::string bad = BadName(*value); !bad.empty()) Refuse(bad);
      Object* clash = scene.Child(scene.objects.at(o.parent), *value);
      if (clash && clash != &o) Refuse("'" + scene.PathOf(o.parent) + "' already has a child named '" + *value + "'");
    }
    o.name = *value;
    return;
  }
  if (a.name == "ConstraintType" &&
      std::find(std::begin(kConstraintTypes), std::end(kConstraintTypes), *value) == std::end(kConstraintTypes))
    Refuse("'" + *value + "' is not a constraint type (Point, Aim, Orient)");
  a.value = *value;
}

void CheckComponent(const Channel& c, std::int32_t component) {
  if (component != 0) Refuse("channel '" + c.name + "' has one component, 0; there is no component " + std::to_string(component));
}

void CheckInterpolation(std::int32_t interpolation) {
  if (interpolation != 0 && interpolation != 1)
    Refuse("interpolation " + std::to_string(interpolation) + " is not one of 0 keys only, 1 linear");
}

// The value at frame index `f`: the key's value, or (linear) the line between the nearest keys on
// either side, the nearest key's value beyond the first or last key, or the default value.
double ValueAt(const Channel& c, std::size_t f, bool linear) {
  if (c.keys[f]) return c.values[f];
  if (!linear) return c.fallback;
  std::size_t before = f, after = f;
  bool hasBefore = false, hasAfter = false;
  while (before > 0 && !hasBefore) hasBefore = c.keys[--before];
  while (after + 1 < c.keys.size() && !hasAfter) hasAfter = c.keys[++after];
  if (hasBefore && hasAfter) {
    double t = static_cast<double>(f - before) / static_cast<double>(after - before);
    return c.values[before] + (c.values[after] - c.values[before]) * t;
  }
  if (hasBefore) return c.values[before];
  if (hasAfter) return c.values[after];
  return c.fallback;
}

// Applies `mode` to the key selection with `chosen` as the frames the command names.
void SelectKeys(Channel& c, std::vector<bool> chosen, SelectMode mode) {
  for (std::size_t f = 0; f < chosen.size(); ++f) chosen[f] = chosen[f] && c.keys[f];
  ApplyMode(c.selected, chosen, mode);
}

}  // namespace

// ---- Attributes -----------------------------------------------------------------------------

CLIENT3_HANDLER(ObjectGetAttribute, Read) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  out.Put(AttributeOf(o, in.Text()).id);
}

CLIENT3_HANDLER(ObjectGetAttributes, Read) {
  std::vector<std::uint64_t> ids;
  for (const Attribute& a : ObjectOf(context.scene, in.Get<std::uint64_t>()).attributes) ids.push_back(a.id);
  out.Put(ids);
}

CLIENT3_HANDLER(ObjectHasAttribute, Read) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  out.Put(std::int32_t{o.FindAttribute(in.Get<std::uint64_t>()) != nullptr});
}

CLIENT3_HANDLER(ObjectGetAttributeValue, Read) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  Attribute& a = AttributeOf(o, in.Text());
  PutAttribute(out, a.type, a.editable, ValueOf(context.scene, o, a));
}

CLIENT3_HANDLER(ObjectSetAttributeValue, Write) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  Attribute& a = AttributeOf(o, in.Text());
  SetAttribute(context.scene, o, a, in.Text());
}

CLIENT3_HANDLER(AttributeGetName, Read) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  out.Put(AttributeOf(o, in.Get<std::uint64_t>()).name);
}

CLIENT3_HANDLER(AttributeGetValue, Read) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  Attribute& a = AttributeOf(o, in.Get<std::uint64_t>());
  PutAttribute(out, a.type, a.editable, ValueOf(context.scene, o, a));
}

CLIENT3_HANDLER(AttributeSetValue, Write) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  Attribute& a = AttributeOf(o, in.Get<std::uint64_t>());
  SetAttribute(context.scene, o, a, in.Text());
}

// ---- Channels -------------------------------------------------------------------------------

CLIENT3_HANDLER(ObjectGetChannel, Read) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  std::string_view name = in.Text();
  Channel* c = o.FindChannel(name);
  if (!c) Refuse("object " + std::to_string(o.id) + " has no channel named '" + std::string(name) + "'");
  PutAttribute(out, ValueType::Float, true, std::to_string(c->id));
}

CLIENT3_HANDLER(ObjectGetChannels, Read) {
  std::string names;
  for (const Channel& c : ObjectOf(context.scene, in.Get<std::uint64_t>()).channels) names += (names.empty() ? "" : ",") + c.name;
  out.Put(names);
}

CLIENT3_HANDLER(ObjectHasChannel, Read) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  out.Put(std::int32_t{o.FindChannel(in.Get<std::uint64_t>()) != nullptr});
}

CLIENT3_HANDLER(ChannelGetName, Read) { out.Put(ChannelOf(context.scene, in).name); }

CLIENT3_HANDLER(ChannelGetValue, Read) {
  Channel& c = ChannelOf(context.scene, in);
  std::size_t f = FrameIndex(context.scene, in.Get<std::int32_t>());
  CheckComponent(c, in.Get<std::int32_t>());
  std::int32_t interpolation = in.Get<std::int32_t>();
  CheckInterpolation(interpolation);
  NoOptions("ChannelGetValue", in.Text());
  PutAttribute(out, ValueType::Float, true, NumberText(ValueAt(c, f, interpolation == 1)));
}

CLIENT3_HANDLER(ChannelSetValue, Write) {
  Channel& c = ChannelOf(context.scene, in);
  std::size_t f = FrameIndex(context.scene, in.Get<std::int32_t>());
  CheckComponent(c, in.Get<std::int32_t>());
  CheckInterpolation(in.Get<std::int32_t>());
  std::string_view text = in.Text();
  NoOptions("ChannelSetValue", in.Text());
  std::optional<double> value = ParseDouble(text);
  if (!value) Refuse("'" + std::string(text) + "' is not a Float value for channel '" + c.name + "'");
  c.SetKey(f, *value);
}

CLIENT3_HANDLER(ChannelHasKey, Read) {
  Channel& c = ChannelOf(context.scene, in);
  out.Put(c.keys[FrameIndex(context.scene, in.Get<std::int32_t>())] ? "true" : "false");
}

CLIENT3_HANDLER(ChannelSelectKeys, Write) {
  Channel& c = ChannelOf(context.scene, in);
  const Timeline& t = context.scene.timeline;
  std::vector<bool> chosen(c.keys.size(), false);
  chosen[static_cast<std::size_t>(t.FrameAt(t.Now()) - 1)] = true;
  SelectKeys(c, chosen, SelectMode::Replace);
}

CLIENT3_HANDLER(ChannelDeleteKey, Write) {
  Channel& c = ChannelOf(context.scene, in);
  std::int32_t frame = in.Get<std::int32_t>();
  std::size_t f = FrameIndex(context.scene, frame);
  if (!c.keys[f]) Refuse("channel '" + c.name + "' has no key at frame " + std::to_string(frame));
  c.DeleteKey(f);
}

CLIENT3_HANDLER(ChannelDeleteAllKeys, Write) {
  Channel& c = ChannelOf(context.scene, in);
  for (std::size_t f = 0; f < c.keys.size(); ++f) c.DeleteKey(f);
}

CLIENT3_HANDLER(ChannelDeleteSelectedKeys, Write) {
  Channel& c = ChannelOf(context.scene, in);
  for (std::size_t f = 0; f < c.keys.size(); ++f)
    if (c.selected[f]) c.DeleteKey(f);
}

CLIENT3_HANDLER(ChannelSelectKeysFromRanges, Write) {
  Channel& c = ChannelOf(context.scene, in);
  SelectKeys(c, context.scene.timeline.selected, ModeOf(in.Get<std::int32_t>()));
}

CLIENT3_HANDLER(ChannelSelectAllKeys, Write) {
  Channel& c = ChannelOf(context.scene, in);
  SelectKeys(c, std::vector<bool>(c.keys.size(), true), ModeOf(in.Get<std::int32_t>()));
}

CLIENT3_HANDLER(ChannelInvertKeySelection, Write) {
  Channel& c = ChannelOf(context.scene, in);
  SelectKeys(c, std::vector<bool>(c.keys.size(), true), SelectMode::Toggle);
}

CLIENT3_HANDLER(ChannelGetDefaultValue, Read) {
  PutAttribute(out, ValueType::Float, true, NumberText(ChannelOf(context.scene, in).fallback));
}

CLIENT3_HANDLER(ChannelSetDefaultValue, Write) {
  Channel& c = ChannelOf(context.scene, in);
  std::string_view text = in.Text();
  std::optional<double> value = ParseDouble(text);
  if (!value) Refuse("'" + std::string(text) + "' is not a Float value for channel '" + c.name + "'");
  c.fallback = *value;
}

CLIENT3_HANDLER(ChannelGetGaps, Read) {
  Channel& c = ChannelOf(context.scene, in);
  CheckComponent(c, in.Get<std::int32_t>());
  out.Put(RangesText(Runs(c.keys.size(), [&](std::size_t f) { return !c.keys[f]; })));
}

// ---- Parameters -----------------------------------------------------------------------------

CLIENT3_HANDLER(ObjectGetParameter, Read) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  ParameterKind kind = KindOf(in.Get<std::int32_t>());
  std::string_view name = in.Text();
  Parameter* p = o.FindParameter(name);
  if (!p || !OfKind(*p, kind))
    Refuse("object " + std::to_string(o.id) + " has no parameter named '" + std::string(name) + "'" + (kind == ParameterKind::Any ? "" : " of that kind"));
  out.Put(p->id);
}

CLIENT3_HANDLER(ObjectGetParameters, Read) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  ParameterKind kind = KindOf(in.Get<std::int32_t>());
  std::vector<std::uint64_t> ids;
  for (const Parameter& p : o.parameters)
    if (OfKind(p, kind)) ids.push_back(p.id);
  out.Put(ids);
}

CLIENT3_HANDLER(ObjectHasParameter, Read) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  ParameterKind kind = KindOf(in.Get<std::int32_t>());
  Parameter* p = o.FindParameter(in.Get<std::uint64_t>());
  out.Put(std::int32_t{p && OfKind(*p, kind)});
}

CLIENT3_HANDLER(ParameterGet, Read) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  ObjectId id = in.Get<std::uint64_t>();
  Parameter& p = ParameterOf(o, id, KindOf(in.Get<std::int32_t>()));
  std::string_view field = in.Text();
  if (field == "Name") out.Put(p.name);
  else if (field == "Kind") out.Put(p.kind == ParameterKind::Number ? "Number" : "Text");
  else if (field == "Value") out.Put(p.value);
  else if (field == "Default") out.Put(p.fallback);
  else if (field == "Unit") out.Put(p.unit);
  else if (field == "Required") out.Put(p.required ? "true" : "false");
  else Refuse("a parameter has no field named '" + std::string(field) + "' (Name, Kind, Value, Default, Unit, Required)");
}

CLIENT3_HANDLER(ParameterSet, Write) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  ObjectId id = in.Get<std::uint64_t>();
  Parameter& p = ParameterOf(o, id, KindOf(in.Get<std::int32_t>()));
  std::string_view field = in.Text(), text = in.Text();
  ValueType type = p.kind == ParameterKind::Number ? ValueType::Float : ValueType::String;
  if (field == "Name" || field == "Kind") Refuse("field '" + std::string(field) + "' of a parameter is read-only");
  if (field == "Unit") return void(p.unit = text);
  if (field == "Required") type = ValueType::Bool;
  else if (field != "Value" && field != "Default")
    Refuse("a parameter has no field named '" + std::string(field) + "' (Name, Kind, Value, Default, Unit, Required)");
  std::optional<std::string> value = Canonical(type, text);
  if (!value) Refuse("'" + std::string(text) + "' is not a " + std::string(ValueTypeName(type)) + " value for field '" + std::string(field) + "'");
  if (field == "Value") p.value = *value;
  else if (field == "Default") p.fallback = *value;
  else p.required = *value == "true";
}

CLIENT3_HANDLER(ParameterCreate, Write) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  std::string name(in.Text());
  ParameterKind kind = KindOf(in.Get<std::int32_t>());
  if (kind == ParameterKind::Any) Refuse("a parameter is created with kind 1 number or 2 text");
  if (std::string bad = BadName(name); !bad.empty()) Refuse(bad);
  if (o.FindParameter(name)) Refuse("object " + std::to_string(o.id) + " already has a parameter named '" + name + "'");
  std::string zero = kind == ParameterKind::Number ? "0" : "";
  o.parameters.push_back({NewId(), name, kind, zero, zero, "", false});
  out.Put(o.parameters.back().id);
}

CLIENT3_HANDLER(ParameterRemove, Write) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  Parameter& p = ParameterOf(o, in.Get<std::uint64_t>(), ParameterKind::Any);
  NoOptions("ParameterRemove", in.Text());
  o.parameters.erase(o.parameters.begin() + (&p - o.parameters.data()));
}

}  // namespace client3::host
