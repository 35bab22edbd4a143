// The object tree: finding, creating, removing, re-parenting and selecting objects, the active clip,
// and each object's attributes, channels with their keys, and parameters.
#include <algorithm>

#include "host/handlers.h"

namespace client3::host {

using protocol::Id;
using protocol::Reader;
using protocol::Writer;

namespace {

std::string IdText(ObjectId id) { return std::to_string(id); }

void NoOptions(std::string_view command, std::string_view options) {
  if (!options.empty()) Refuse("'" + std::string(command) + "' takes no options: '" + std::string(options) + "'");
}

Attribute& AttributeOf(Object& o, std::string_view name) {
  if (Attribute* a = o.FindAttribute(name)) return *a;
  Refuse("object " + IdText(o.id) + " has no attribute named '" + std::string(name) + "'");
}
Attribute& AttributeOf(Object& o, ObjectId id) {
  if (Attribute* a = o.FindAttribute(id)) return *a;
  Refuse("object " + IdText(o.id) + " has no attribute with id " + IdText(id));
}
Channel& ChannelOf(Object& o, ObjectId id) {
  if (Channel* c = o.FindChannel(id)) return *c;
  Refuse("object " + IdText(o.id) + " has no channel with id " + IdText(id));
}
Channel& ChannelOf(Scene& scene, Reader& in) {
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
    Refuse("object " + IdText(o.id) + " has no parameter with id " + IdText(id) + (kind == ParameterKind::Any ? "" : " of that kind"));
  return *p;
}

void PutObject(Writer& out, const Object* o) {
  out.Put(o ? o->id : ObjectId{0});
  out.Put(o ? o->type : std::string());
}
void PutObjects(Scene& scene, Writer& out, const std::vector<ObjectId>& ids) {
  out.Put(ids);
  out.PutTexts(ids, [&](ObjectId id) -> std::string_view { return scene.objects.at(id).type; });
}

// An attribute's value as text: Name, Type and WorldTranslation are read from the object itself, an
// Analog object's Rate (samples a second) and Samples (its count) from the take.
std::string ValueOf(Scene& scene, Object& o, const Attribute& a) {
  if (a.name == "Name") return o.name;
  if (a.name == "Type") return o.type;
  if (a.name == "WorldTranslation") {
    std::vector<double> w = scene.WorldTranslation(o.id);
    return NumberText(w[0]) + "," + NumberText(w[1]) + "," + NumberText(w[2]);
  }
  std::size_t perFrame = scene.analog.data.samplesPerFrame();
  if (a.name == "Rate") return NumberText(scene.timeline.rate * static_cast<double>(perFrame));
  if (a.name == "Samples") return std::to_string(static_cast<std::size_t>(scene.frames) * perFrame);
  return a.value;
}

void PutAttribute(Writer& out, ValueType type, bool editable, std::string_view text) {
  out.Put(static_cast<std::int32_t>(type));
  out.Put(editable);
  out.Put(text);
}

void SetAttribute(Scene& scene, Object& o, Attribute& a, std::string_view text) {
  if (!a.editable) Refuse("attribute '" + a.name + "' of object " + IdText(o.id) + " is read-only");
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

// ---- Finding, creating and removing objects -------------------------------------------------------

void SceneGetObject(Context& context, Reader& in, Writer& out) {
  std::string_view path = in.Text();
  Object* o = context.scene.AtPath(path);
  if (!o) Refuse("no object at path '" + std::string(path) + "'");
  PutObject(out, o);
}

// Every object, the root first, parents before their children.
std::vector<ObjectId> Everything(Scene& scene) {
  std::vector<ObjectId> all{scene.root};
  std::vector<ObjectId> below = scene.Descendants(scene.root);
  all.insert(all.end(), below.begin(), below.end());
  return all;
}

void SceneGetObjectList(Context& context, Reader& in, Writer& out) {
  std::string_view type = in.Text();
  if (!type.empty() && !KnownType(type)) Refuse("no object type named '" + std::string(type) + "'");
  std::vector<ObjectId> ids;
  for (ObjectId id : Everything(context.scene))
    if (type.empty() || context.scene.objects.at(id).type == type) ids.push_back(id);
  PutObjects(context.scene, out, ids);
}

void CheckPlace(Scene& scene, const Object& parent, std::string_view type, std::string_view name, const Object* moving) {
  if (!MayContain(parent.type, type))
    Refuse("a " + std::string(type) + " cannot be a child of a " + parent.type + " ('" + scene.PathOf(parent.id) + "')");
  Object* clash = scene.Child(parent, name);
  if (clash && clash != moving) Refuse("'" + scene.PathOf(parent.id) + "' already has a child named '" + std::string(name) + "'");
}

void SceneCreateObject(Context& context, Reader& in, Writer& out) {
  Scene& scene = context.scene;
  std::string type(in.Text()), name(in.Text());
  ObjectId parentId = in.Get<std::uint64_t>();
  NoOptions("SceneCreateObject", in.Text());
  if (!KnownType(type) || type == "Scene") Refuse("no object type named '" + type + "' can be created");
  if (type == "Analog") Refuse("an Analog object comes only with the analog channels of an imported C3D file");
  if (std::string bad = BadName(name); !bad.empty()) Refuse(bad);
  Object& parent = ObjectOf(scene, parentId);
  CheckPlace(scene, parent, type, name, nullptr);
  PutObject(out, &scene.Add(parentId, type, name));
}

void SceneRemoveObject(Context& context, Reader& in, Writer&) {
  Scene& scene = context.scene;
  Object& o = ObjectOf(scene, in.Get<std::uint64_t>());
  NoOptions("SceneRemoveObject", in.Text());
  if (o.id == scene.root) Refuse("the scene root cannot be removed");
  scene.Remove(o.id);
}

// ---- Selection --------------------------------------------------------------------------------

// Applies `mode` to the selection with `chosen` as the objects the command names.
void Select(Scene& scene, const std::vector<ObjectId>& chosen, SelectMode mode) {
  auto& selection = scene.selection;
  auto selected = [&](ObjectId id) { return std::find(selection.begin(), selection.end(), id) != selection.end(); };
  auto drop = [&](ObjectId id) { selection.erase(std::remove(selection.begin(), selection.end(), id), selection.end()); };
  if (mode == SelectMode::Replace) selection.clear();
  for (ObjectId id : chosen) {
    if (mode == SelectMode::Remove || (mode == SelectMode::Toggle && selected(id)))
      drop(id);
    else if (!selected(id))
      selection.push_back(id);
  }
}

void SceneSelectObject(Context& context, Reader& in, Writer&) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  NoOptions("SceneSelectObject", in.Text());
  Select(context.scene, {o.id}, ModeOf(in.Get<std::int32_t>()));
}

void ObjectSelect(Context& context, Reader& in, Writer&) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  Select(context.scene, {o.id}, ModeOf(in.Get<std::int32_t>()));
}

void SceneSelectAllObjects(Context& context, Reader& in, Writer&) {
  SelectMode mode = ModeOf(in.Get<std::int32_t>());
  Select(context.scene, context.scene.Descendants(context.scene.root), mode);
}

void SceneSelectObjectsOfType(Context& context, Reader& in, Writer&) {
  std::string_view type = in.Text();
  SelectMode mode = ModeOf(in.Get<std::int32_t>());
  if (!KnownType(type)) Refuse("no object type named '" + std::string(type) + "'");
  std::vector<ObjectId> chosen;
  for (ObjectId id : context.scene.Descendants(context.scene.root))
    if (context.scene.objects.at(id).type == type) chosen.push_back(id);
  Select(context.scene, chosen, mode);
}

void SceneInvertObjectSelection(Context& context, Reader&, Writer&) {
  Select(context.scene, context.scene.Descendants(context.scene.root), SelectMode::Toggle);
}

void SceneGetSelectedObjects(Context& context, Reader&, Writer& out) { PutObjects(context.scene, out, context.scene.selection); }

void SceneGetPrimarySelectedObject(Context& context, Reader&, Writer& out) {
  auto& selection = context.scene.selection;
  PutObject(out, selection.empty() ? nullptr : &context.scene.objects.at(selection.front()));
}

void SceneGetActiveClip(Context& context, Reader&, Writer& out) {
  Object* clip = context.scene.Find(context.scene.activeClip);
  out.Put(clip ? clip->name : std::string());
}

void SceneSetActiveClip(Context& context, Reader& in, Writer&) {
  Scene& scene = context.scene;
  std::string_view name = in.Text();
  Object* clip = scene.Child(scene.Root(), name);
  if (!clip || clip->type != "Clip") Refuse("no clip named '" + std::string(name) + "'");
  scene.activeClip = clip->id;
}

// ---- The tree -----------------------------------------------------------------------------------

void ObjectGetChildren(Context& context, Reader& in, Writer& out) {
  PutObjects(context.scene, out, ObjectOf(context.scene, in.Get<std::uint64_t>()).children);
}

void ObjectGetDescendants(Context& context, Reader& in, Writer& out) {
  PutObjects(context.scene, out, context.scene.Descendants(ObjectOf(context.scene, in.Get<std::uint64_t>()).id));
}

void ObjectGetParent(Context& context, Reader& in, Writer& out) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  PutObject(out, context.scene.Find(o.parent));
}

void ObjectGetPath(Context& context, Reader& in, Writer& out) {
  out.Put(context.scene.PathOf(ObjectOf(context.scene, in.Get<std::uint64_t>()).id));
}

void ObjectGetType(Context& context, Reader& in, Writer& out) { out.Put(ObjectOf(context.scene, in.Get<std::uint64_t>()).type); }

void ObjectSetParent(Context& context, Reader& in, Writer&) {
  Scene& scene = context.scene;
  Object& o = ObjectOf(scene, in.Get<std::uint64_t>());
  Object& parent = ObjectOf(scene, in.Get<std::uint64_t>());
  bool keepWorld = in.Get<bool>();
  if (o.id == scene.root) Refuse("the scene root cannot be moved");
  if (parent.id == o.id || scene.IsBelow(parent.id, o.id))
    Refuse("object " + IdText(o.id) + " cannot be moved under itself or its descendants");
  CheckPlace(scene, parent, o.type, o.name, &o);
  std::vector<double> world = scene.WorldTranslation(o.id);
  auto& siblings = scene.objects.at(o.parent).children;
  siblings.erase(std::find(siblings.begin(), siblings.end(), o.id));
  parent.children.push_back(o.id);
  o.parent = parent.id;
  if (Attribute* local = o.FindAttribute("Translation"); local && keepWorld) {
    std::vector<double> above = scene.WorldTranslation(parent.id);
    local->value = NumberText(world[0] - above[0]) + "," + NumberText(world[1] - above[1]) + "," + NumberText(world[2] - above[2]);
  }
}

void ObjectSetConstraint(Context& context, Reader& in, Writer&) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  std::int32_t state = in.Get<std::int32_t>();
  if (o.type != "Constraint") Refuse("object " + IdText(o.id) + " is a " + o.type + ", not a Constraint");
  if (state != 0 && state != 1) Refuse("constraint state " + std::to_string(state) + " is not one of 0 off, 1 on");
  AttributeOf(o, "Active").value = state ? "true" : "false";
}

// ---- Attributes --------------------------------------------------------------------------------

void ObjectGetAttribute(Context& context, Reader& in, Writer& out) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  out.Put(AttributeOf(o, in.Text()).id);
}

void ObjectGetAttributes(Context& context, Reader& in, Writer& out) {
  std::vector<std::uint64_t> ids;
  for (const Attribute& a : ObjectOf(context.scene, in.Get<std::uint64_t>()).attributes) ids.push_back(a.id);
  out.Put(ids);
}

void ObjectHasAttribute(Context& context, Reader& in, Writer& out) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  out.Put(std::int32_t{o.FindAttribute(in.Get<std::uint64_t>()) != nullptr});
}

void ObjectGetAttributeValue(Context& context, Reader& in, Writer& out) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  Attribute& a = AttributeOf(o, in.Text());
  PutAttribute(out, a.type, a.editable, ValueOf(context.scene, o, a));
}

void ObjectSetAttributeValue(Context& context, Reader& in, Writer&) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  Attribute& a = AttributeOf(o, in.Text());
  SetAttribute(context.scene, o, a, in.Text());
}

void AttributeGetName(Context& context, Reader& in, Writer& out) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  out.Put(AttributeOf(o, in.Get<std::uint64_t>()).name);
}

void AttributeGetValue(Context& context, Reader& in, Writer& out) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  Attribute& a = AttributeOf(o, in.Get<std::uint64_t>());
  PutAttribute(out, a.type, a.editable, ValueOf(context.scene, o, a));
}

void AttributeSetValue(Context& context, Reader& in, Writer&) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  Attribute& a = AttributeOf(o, in.Get<std::uint64_t>());
  SetAttribute(context.scene, o, a, in.Text());
}

// ---- Channels -----------------------------------------------------------------------------------

void ObjectGetChannel(Context& context, Reader& in, Writer& out) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  std::string_view name = in.Text();
  Channel* c = o.FindChannel(name);
  if (!c) Refuse("object " + IdText(o.id) + " has no channel named '" + std::string(name) + "'");
  PutAttribute(out, ValueType::Float, true, IdText(c->id));
}

void ObjectGetChannels(Context& context, Reader& in, Writer& out) {
  std::string names;
  for (const Channel& c : ObjectOf(context.scene, in.Get<std::uint64_t>()).channels) names += (names.empty() ? "" : ",") + c.name;
  out.Put(names);
}

void ObjectHasChannel(Context& context, Reader& in, Writer& out) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  out.Put(std::int32_t{o.FindChannel(in.Get<std::uint64_t>()) != nullptr});
}

void ChannelGetName(Context& context, Reader& in, Writer& out) { out.Put(ChannelOf(context.scene, in).name); }

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

void ChannelGetValue(Context& context, Reader& in, Writer& out) {
  Channel& c = ChannelOf(context.scene, in);
  std::size_t f = FrameIndex(context.scene, in.Get<std::int32_t>());
  CheckComponent(c, in.Get<std::int32_t>());
  std::int32_t interpolation = in.Get<std::int32_t>();
  CheckInterpolation(interpolation);
  NoOptions("ChannelGetValue", in.Text());
  PutAttribute(out, ValueType::Float, true, NumberText(ValueAt(c, f, interpolation == 1)));
}

void ChannelSetValue(Context& context, Reader& in, Writer&) {
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

void ChannelHasKey(Context& context, Reader& in, Writer& out) {
  Channel& c = ChannelOf(context.scene, in);
  out.Put(c.keys[FrameIndex(context.scene, in.Get<std::int32_t>())] ? "true" : "false");
}

// Applies `mode` to the key selection with `chosen` as the frames the command names.
void SelectKeys(Channel& c, std::vector<bool> chosen, SelectMode mode) {
  for (std::size_t f = 0; f < chosen.size(); ++f) chosen[f] = chosen[f] && c.keys[f];
  ApplyMode(c.selected, chosen, mode);
}

void ChannelSelectKeys(Context& context, Reader& in, Writer&) {
  Channel& c = ChannelOf(context.scene, in);
  const Timeline& t = context.scene.timeline;
  std::vector<bool> chosen(c.keys.size(), false);
  chosen[static_cast<std::size_t>(t.FrameAt(t.Now()) - 1)] = true;
  SelectKeys(c, chosen, SelectMode::Replace);
}

void ChannelDeleteKey(Context& context, Reader& in, Writer&) {
  Channel& c = ChannelOf(context.scene, in);
  std::int32_t frame = in.Get<std::int32_t>();
  std::size_t f = FrameIndex(context.scene, frame);
  if (!c.keys[f]) Refuse("channel '" + c.name + "' has no key at frame " + std::to_string(frame));
  c.DeleteKey(f);
}

void ChannelDeleteAllKeys(Context& context, Reader& in, Writer&) {
  Channel& c = ChannelOf(context.scene, in);
  for (std::size_t f = 0; f < c.keys.size(); ++f) c.DeleteKey(f);
}

void ChannelDeleteSelectedKeys(Context& context, Reader& in, Writer&) {
  Channel& c = ChannelOf(context.scene, in);
  for (std::size_t f = 0; f < c.keys.size(); ++f)
    if (c.selected[f]) c.DeleteKey(f);
}

void ChannelSelectKeysFromRanges(Context& context, Reader& in, Writer&) {
  Channel& c = ChannelOf(context.scene, in);
  SelectKeys(c, context.scene.timeline.selected, ModeOf(in.Get<std::int32_t>()));
}

void ChannelSelectAllKeys(Context& context, Reader& in, Writer&) {
  Channel& c = ChannelOf(context.scene, in);
  SelectKeys(c, std::vector<bool>(c.keys.size(), true), ModeOf(in.Get<std::int32_t>()));
}

void ChannelInvertKeySelection(Context& context, Reader& in, Writer&) {
  Channel& c = ChannelOf(context.scene, in);
  SelectKeys(c, std::vector<bool>(c.keys.size(), true), SelectMode::Toggle);
}

void ChannelGetDefaultValue(Context& context, Reader& in, Writer& out) {
  PutAttribute(out, ValueType::Float, true, NumberText(ChannelOf(context.scene, in).fallback));
}

void ChannelSetDefaultValue(Context& context, Reader& in, Writer&) {
  Channel& c = ChannelOf(context.scene, in);
  std::string_view text = in.Text();
  std::optional<double> value = ParseDouble(text);
  if (!value) Refuse("'" + std::string(text) + "' is not a Float value for channel '" + c.name + "'");
  c.fallback = *value;
}

void ChannelGetGaps(Context& context, Reader& in, Writer& out) {
  Channel& c = ChannelOf(context.scene, in);
  CheckComponent(c, in.Get<std::int32_t>());
  std::string gaps;
  for (std::size_t f = 0; f < c.keys.size();) {
    if (c.keys[f]) {
      ++f;
      continue;
    }
    std::size_t last = f;
    while (last + 1 < c.keys.size() && !c.keys[last + 1]) ++last;
    gaps += (gaps.empty() ? "" : ",") + std::to_string(f + 1) + "-" + std::to_string(last + 1);
    f = last + 1;
  }
  out.Put(gaps);
}

// ---- Parameters ---------------------------------------------------------------------------------

void ObjectGetParameter(Context& context, Reader& in, Writer& out) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  ParameterKind kind = KindOf(in.Get<std::int32_t>());
  std::string_view name = in.Text();
  Parameter* p = o.FindParameter(name);
  if (!p || !OfKind(*p, kind))
    Refuse("object " + IdText(o.id) + " has no parameter named '" + std::string(name) + "'" + (kind == ParameterKind::Any ? "" : " of that kind"));
  out.Put(p->id);
}

void ObjectGetParameters(Context& context, Reader& in, Writer& out) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  ParameterKind kind = KindOf(in.Get<std::int32_t>());
  std::vector<std::uint64_t> ids;
  for (const Parameter& p : o.parameters)
    if (OfKind(p, kind)) ids.push_back(p.id);
  out.Put(ids);
}

void ObjectHasParameter(Context& context, Reader& in, Writer& out) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  ParameterKind kind = KindOf(in.Get<std::int32_t>());
  Parameter* p = o.FindParameter(in.Get<std::uint64_t>());
  out.Put(std::int32_t{p && OfKind(*p, kind)});
}

void ParameterGet(Context& context, Reader& in, Writer& out) {
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

void ParameterSet(Context& context, Reader& in, Writer&) {
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

void ParameterCreate(Context& context, Reader& in, Writer& out) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  std::string name(in.Text());
  ParameterKind kind = KindOf(in.Get<std::int32_t>());
  if (kind == ParameterKind::Any) Refuse("a parameter is created with kind 1 number or 2 text");
  if (std::string bad = BadName(name); !bad.empty()) Refuse(bad);
  if (o.FindParameter(name)) Refuse("object " + IdText(o.id) + " already has a parameter named '" + name + "'");
  std::string zero = kind == ParameterKind::Number ? "0" : "";
  o.parameters.push_back({NewId(), name, kind, zero, zero, "", false});
  out.Put(o.parameters.back().id);
}

void ParameterRemove(Context& context, Reader& in, Writer&) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  Parameter& p = ParameterOf(o, in.Get<std::uint64_t>(), ParameterKind::Any);
  NoOptions("ParameterRemove", in.Text());
  o.parameters.erase(o.parameters.begin() + (&p - o.parameters.data()));
}

#define CLIENT3_ENTRY(name) {Id::name, &name}
#define CLIENT3_READ(name) {Id::name, &name, Access::Read}
constexpr HandlerEntry kHandlers[] = {
    CLIENT3_READ(SceneGetObject), CLIENT3_READ(SceneGetObjectList), CLIENT3_ENTRY(SceneCreateObject),
    CLIENT3_ENTRY(SceneRemoveObject), CLIENT3_ENTRY(SceneSelectObject), CLIENT3_ENTRY(SceneSelectAllObjects),
    CLIENT3_ENTRY(SceneSelectObjectsOfType), CLIENT3_ENTRY(SceneInvertObjectSelection), CLIENT3_READ(SceneGetSelectedObjects),
    CLIENT3_READ(SceneGetPrimarySelectedObject), CLIENT3_READ(SceneGetActiveClip), CLIENT3_ENTRY(SceneSetActiveClip),
    CLIENT3_READ(ObjectGetAttribute), CLIENT3_READ(ObjectGetAttributes), CLIENT3_READ(ObjectHasAttribute),
    CLIENT3_READ(ObjectGetAttributeValue), CLIENT3_ENTRY(ObjectSetAttributeValue), CLIENT3_READ(ObjectGetChannel),
    CLIENT3_READ(ObjectGetChannels), CLIENT3_READ(ObjectHasChannel), CLIENT3_READ(ObjectGetParameter),
    CLIENT3_READ(ObjectGetParameters), CLIENT3_READ(ObjectHasParameter), CLIENT3_READ(ObjectGetChildren),
    CLIENT3_READ(ObjectGetDescendants), CLIENT3_READ(ObjectGetParent), CLIENT3_READ(ObjectGetPath),
    CLIENT3_ENTRY(ObjectSetParent), CLIENT3_READ(ObjectGetType), CLIENT3_ENTRY(ObjectSelect),
    CLIENT3_ENTRY(ObjectSetConstraint), CLIENT3_READ(AttributeGetName), CLIENT3_READ(AttributeGetValue),
    CLIENT3_ENTRY(AttributeSetValue), CLIENT3_READ(ChannelGetName), CLIENT3_READ(ChannelGetValue),
    CLIENT3_ENTRY(ChannelSetValue), CLIENT3_READ(ChannelHasKey), CLIENT3_ENTRY(ChannelSelectKeys),
    CLIENT3_ENTRY(ChannelDeleteKey), CLIENT3_ENTRY(ChannelDeleteAllKeys), CLIENT3_ENTRY(ChannelDeleteSelectedKeys),
    CLIENT3_ENTRY(ChannelSelectKeysFromRanges), CLIENT3_ENTRY(ChannelSelectAllKeys), CLIENT3_ENTRY(ChannelInvertKeySelection),
    CLIENT3_READ(ChannelGetDefaultValue), CLIENT3_ENTRY(ChannelSetDefaultValue), CLIENT3_READ(ChannelGetGaps),
    CLIENT3_READ(ParameterGet), CLIENT3_ENTRY(ParameterSet), CLIENT3_ENTRY(ParameterCreate),
    CLIENT3_ENTRY(ParameterRemove),
};
#undef CLIENT3_READ
#undef CLIENT3_ENTRY

}  // namespace

std::span<const HandlerEntry> ObjectHandlers() { return kHandlers; }

}  // namespace client3::host
