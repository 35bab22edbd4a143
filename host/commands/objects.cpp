// The handlers of the object tree: finding, creating, removing, re-parenting and selecting objects,
// and the active clip.
#include <algorithm>

#include "host/commands/command.h"
#include "host/commands/lookups.h"

namespace client3::host {

namespace {

void PutObject(protocol::Writer& out, const Object* o) {
  out.Put(o ? o->id : ObjectId{0});
  out.Put(o ? o->type : std::string());
}

void PutObjects(Scene& scene, protocol::Writer& out, const std::vector<ObjectId>& ids) {
  out.Put(ids);
  out.PutTexts(ids, [&](ObjectId id) -> std::string_view { return scene.objects.at(id).type; });
}

// Every object, the root first, parents before their children.
std::vector<ObjectId> Everything(Scene& scene) {
  std::vector<ObjectId> all{scene.root};
  std::vector<ObjectId> below = scene.Descendants(scene.root);
  all.insert(all.end(), below.begin(), below.end());
  return all;
}

void CheckPlace(Scene& scene, const Object& parent, std::string_view type, std::string_view name, const Object* moving) {
  if (!MayContain(parent.type, type))
    Refuse("a " + std::string(type) + " cannot be a child of a " + parent.type + " ('" + scene.PathOf(parent.id) + "')");
  Object* clash = scene.Child(parent, name);
  if (clash && clash != moving) Refuse("'" + scene.PathOf(parent.id) + "' already has a child named '" + std::string(name) + "'");
}

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

}  // namespace

// ---- Finding, creating and removing objects -------------------------------------------------

CLIENT3_HANDLER(SceneGetObject, Read) {
  std::string_view path = in.Text();
  Object* o = context.scene.AtPath(path);
  if (!o) Refuse("no object at path '" + std::string(path) + "'");
  PutObject(out, o);
}

CLIENT3_HANDLER(SceneGetObjectList, Read) {
  std::string_view type = in.Text();
  if (!type.empty() && !KnownType(type)) Refuse("no object type named '" + std::string(type) + "'");
  std::vector<ObjectId> ids;
  for (ObjectId id : Everything(context.scene))
    if (type.empty() || context.scene.objects.at(id).type == type) ids.push_back(id);
  PutObjects(context.scene, out, ids);
}

CLIENT3_HANDLER(SceneCreateObject, Write) {
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

CLIENT3_HANDLER(SceneRemoveObject, Write) {
  Scene& scene = context.scene;
  Object& o = ObjectOf(scene, in.Get<std::uint64_t>());
  NoOptions("SceneRemoveObject", in.Text());
  if (o.id == scene.root) Refuse("the scene root cannot be removed");
  scene.Remove(o.id);
}

// ---- Selection ------------------------------------------------------------------------------

CLIENT3_HANDLER(SceneSelectObject, Write) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  NoOptions("SceneSelectObject", in.Text());
  Select(context.scene, {o.id}, ModeOf(in.Get<std::int32_t>()));
}

CLIENT3_HANDLER(ObjectSelect, Write) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  Select(context.scene, {o.id}, ModeOf(in.Get<std::int32_t>()));
}

CLIENT3_HANDLER(SceneSelectAllObjects, Write) {
  SelectMode mode = ModeOf(in.Get<std::int32_t>());
  Select(context.scene, context.scene.Descendants(context.scene.root), mode);
}

CLIENT3_HANDLER(SceneSelectObjectsOfType, Write) {
  std::string_view type = in.Text();
  SelectMode mode = ModeOf(in.Get<std::int32_t>());
  if (!KnownType(type)) Refuse("no object type named '" + std::string(type) + "'");
  std::vector<ObjectId> chosen;
  for (ObjectId id : context.scene.Descendants(context.scene.root))
    if (context.scene.objects.at(id).type == type) chosen.push_back(id);
  Select(context.scene, chosen, mode);
}

CLIENT3_HANDLER(SceneInvertObjectSelection, Write) {
  Select(context.scene, context.scene.Descendants(context.scene.root), SelectMode::Toggle);
}

CLIENT3_HANDLER(SceneGetSelectedObjects, Read) { PutObjects(context.scene, out, context.scene.selection); }

CLIENT3_HANDLER(SceneGetPrimarySelectedObject, Read) {
  auto& selection = context.scene.selection;
  PutObject(out, selection.empty() ? nullptr : &context.scene.objects.at(selection.front()));
}

CLIENT3_HANDLER(SceneGetActiveClip, Read) {
  Object* clip = context.scene.Find(context.scene.activeClip);
  out.Put(clip ? clip->name : std::string());
}

CLIENT3_HANDLER(SceneSetActiveClip, Write) {
  Scene& scene = context.scene;
  std::string_view name = in.Text();
  Object* clip = scene.Child(scene.Root(), name);
  if (!clip || clip->type != "Clip") Refuse("no clip named '" + std::string(name) + "'");
  scene.activeClip = clip->id;
}

// ---- The tree -------------------------------------------------------------------------------

CLIENT3_HANDLER(ObjectGetChildren, Read) {
  PutObjects(context.scene, out, ObjectOf(context.scene, in.Get<std::uint64_t>()).children);
}

CLIENT3_HANDLER(ObjectGetDescendants, Read) {
  PutObjects(context.scene, out, context.scene.Descendants(ObjectOf(context.scene, in.Get<std::uint64_t>()).id));
}

CLIENT3_HANDLER(ObjectGetParent, Read) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  PutObject(out, context.scene.Find(o.parent));
}

CLIENT3_HANDLER(ObjectGetPath, Read) {
  out.Put(context.scene.PathOf(ObjectOf(context.scene, in.Get<std::uint64_t>()).id));
}

CLIENT3_HANDLER(ObjectGetType, Read) { out.Put(ObjectOf(context.scene, in.Get<std::uint64_t>()).type); }

CLIENT3_HANDLER(ObjectSetParent, Write) {
  Scene& scene = context.scene;
  Object& o = ObjectOf(scene, in.Get<std::uint64_t>());
  Object& parent = ObjectOf(scene, in.Get<std::uint64_t>());
  bool keepWorld = in.Get<bool>();
  if (o.id == scene.root) Refuse("the scene root cannot be moved");
  if (parent.id == o.id || scene.IsBelow(parent.id, o.id))
    Refuse("object " + std::to_string(o.id) + " cannot be moved under itself or its descendants");
  CheckPlace(scene, parent, o.type, o.name, &o);
  std::vector<double> world = scene.WorldTranslation(o.id);
  auto& siblings = scene.objects.at(o.parent).children;
  siblings.erase(std::find(siblings.begin(), siblings.end(), o.id));
  parent.children.push_back(o.id);
  o.parent = parent.id;
  if (Attribute* local = o.FindAttribute("Translation"); local && keepWorld) {
    std::vector<double> above = scene.WorldTranslation(parent.id);
    local->value = VectorText({world[0] - above[0], world[1] - above[1], world[2] - above[2]});
  }
}

CLIENT3_HANDLER(ObjectSetConstraint, Write) {
  Object& o = ObjectOf(context.scene, in.Get<std::uint64_t>());
  std::int32_t state = in.Get<std::int32_t>();
  if (o.type != "Constraint") Refuse("object " + std::to_string(o.id) + " is a " + o.type + ", not a Constraint");
  if (state != 0 && state != 1) Refuse("constraint state " + std::to_string(state) + " is not one of 0 off, 1 on");
  AttributeOf(o, "Active").value = state ? "true" : "false";
}

}  // namespace client3::host
