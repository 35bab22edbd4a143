// The handlers of the scene's name, its subjects with their markers, skeletons and parameters, and
// the markers' trajectories.
#include "host/commands/command.h"
#include "host/commands/lookups.h"
#include "host/server/faults.h"

namespace client3::host {

namespace {

// A subject's skeleton: named after its model; an empty name means the subject's own.
Object& SkeletonOf(Scene& scene, std::string_view subject, std::string_view skeleton) {
  Object& s = SubjectOf(scene, subject);
  if (!skeleton.empty() && skeleton != s.Text("Model"))
    Refuse("subject '" + s.name + "' has no skeleton named '" + std::string(skeleton) + "'");
  return s;
}

Object& Named(const std::vector<Object*>& list, std::string_view name, std::string_view what, const Object& owner) {
  for (Object* item : list)
    if (item->name == name) return *item;
  Refuse("subject '" + owner.name + "' has no " + std::string(what) + " named '" + std::string(name) + "'");
}

std::vector<std::string> NamesOf(const std::vector<Object*>& list) {
  std::vector<std::string> names;
  for (const Object* item : list) names.push_back(item->name);
  return names;
}

// The names of the subject parameters: the subject's parameters of kind Number.
std::vector<std::string> SubjectParameterNames(Object& subject) {
  std::vector<std::string> names;
  for (const Parameter& p : subject.parameters)
    if (p.kind == ParameterKind::Number) names.push_back(p.name);
  return names;
}

// A marker's trajectory: its channels X, Y and Z.
struct Trajectory {
  Channel &x, &y, &z;
  bool Seen(std::size_t f) const { return x.keys[f] && y.keys[f] && z.keys[f]; }
  void Set(std::size_t f, double vx, double vy, double vz, bool seen) {
    if (seen) {
      x.SetKey(f, vx), y.SetKey(f, vy), z.SetKey(f, vz);
    } else {
      x.DeleteKey(f), y.DeleteKey(f), z.DeleteKey(f);
      x.values[f] = vx, y.values[f] = vy, z.values[f] = vz;
    }
  }
};

Trajectory TrajectoryOf(Scene& scene, protocol::Reader& in) {
  Object& s = SubjectOf(scene, in.Text());
  Object& m = Named(scene.OfType(s, "Marker"), in.Text(), "marker", s);
  return {*m.FindChannel("X"), *m.FindChannel("Y"), *m.FindChannel("Z")};
}

}  // namespace

CLIENT3_HANDLER(GetSceneName, Read) {
  out.Put(context.scene.Name());
  out.Put(context.scene.path);
}

CLIENT3_HANDLER(SetSceneName, Write) {
  std::string_view name = in.Text();
  if (name.empty()) Refuse("a scene name cannot be empty");
  context.scene.Root().name = name;
}

CLIENT3_HANDLER(GetSubjectNames, Read) {
  std::vector<Object*> subjects = context.scene.OfType(context.scene.Root(), "Subject");
  out.Put(NamesOf(subjects));
  out.PutTexts(subjects, [](const Object* s) -> std::string_view { return s->Text("Model"); });
  std::vector<bool> active;
  for (const Object* s : subjects) active.push_back(s->Text("Active") == "true");
  out.Put(active);
}

CLIENT3_HANDLER(GetMarkerNames, Read) {
  Scene& scene = context.scene;
  out.Put(NamesOf(scene.OfType(SubjectOf(scene, in.Text()), "Marker")));
}

CLIENT3_HANDLER(GetBoneNames, Read) {
  std::string_view subject = in.Text();
  out.Put(NamesOf(context.scene.Bones(SkeletonOf(context.scene, subject, in.Text()))));
}

CLIENT3_HANDLER(GetRootBone, Read) {
  std::string_view subject = in.Text();
  std::vector<Object*> roots = context.scene.OfType(SkeletonOf(context.scene, subject, in.Text()), "Bone");
  out.Put(roots.empty() ? std::string() : roots.front()->name);
}

CLIENT3_HANDLER(GetBoneDetails, Read) {
  Scene& scene = context.scene;
  std::string_view subject = in.Text(), skeleton = in.Text();
  Object& s = SkeletonOf(scene, subject, skeleton);
  Object& bone = Named(scene.Bones(s), in.Text(), "bone", s);
  Object& parent = scene.objects.at(bone.parent);
  out.Put(parent.type == "Bone" ? parent.name : std::string());
  out.Put(NamesOf(scene.OfType(bone, "Bone")));
}

CLIENT3_HANDLER(GetConstraintNames, Read) {
  std::string_view subject = in.Text();
  out.Put(NamesOf(context.scene.OfType(SkeletonOf(context.scene, subject, in.Text()), "Constraint")));
}

CLIENT3_HANDLER(GetConstraintDetails, Read) {
  std::string_view subject = in.Text(), skeleton = in.Text();
  Object& s = SkeletonOf(context.scene, subject, skeleton);
  Object& c = Named(context.scene.OfType(s, "Constraint"), in.Text(), "constraint", s);
  out.Put(c.Text("Active") == "true");
  out.Put(c.Text("Source"));
  out.Put(c.Text("Target"));
  std::vector<double> offset = VectorOf(c.Text("Offset"));
  out.Put(std::vector<float>(offset.begin(), offset.end()));
  out.Put(c.Text("ConstraintType"));
}

CLIENT3_HANDLER(GetSubjectParamNames, Read) {
  std::string_view subject = in.Text();
  out.Put(SubjectParameterNames(SkeletonOf(context.scene, subject, in.Text())));
}

CLIENT3_HANDLER(GetSubjectParamDetails, Read) {
  std::string_view subject = in.Text(), skeleton = in.Text(), name = in.Text();
  Object& s = SkeletonOf(context.scene, subject, skeleton);
  Parameter* p = s.FindParameter(name);
  if (!p || p->kind != ParameterKind::Number)
    Refuse("subject '" + s.name + "' has no parameter named '" + std::string(name) + "'");
  out.Put(static_cast<float>(ParseDouble(p->value).value_or(0)));
  out.Put(static_cast<float>(ParseDouble(p->fallback).value_or(0)));
  out.Put(p->unit);
  out.Put(p->required);
}

// The channels' values are the positions, written as they are stored.
CLIENT3_HANDLER(GetTrajectory, Read) {
  Trajectory t = TrajectoryOf(context.scene, in);
  out.Put(t.x.values), out.Put(t.y.values), out.Put(t.z.values);
  char* seen = out.Block(protocol::Type::Bools, t.x.values.size(), 1);
  for (std::size_t f = 0; f < t.x.values.size(); ++f) seen[f] = t.Seen(f);
}

CLIENT3_HANDLER(SetTrajectory, Write) {
  Trajectory t = TrajectoryOf(context.scene, in);
  std::vector<double> x, y, z;
  std::vector<bool> e;
  in.Get(x), in.Get(y), in.Get(z), in.Get(e);
  auto frames = static_cast<std::size_t>(context.scene.frames);
  if (x.size() != frames || y.size() != frames || z.size() != frames || e.size() != frames)
    Refuse("a trajectory needs " + std::to_string(frames) + " frames in X, Y, Z and E (given " + std::to_string(x.size()) + ", " +
           std::to_string(y.size()) + ", " + std::to_string(z.size()) + ", " + std::to_string(e.size()) + ")");
  for (std::size_t f = 0; f < frames; ++f) t.Set(f, x[f], y[f], z[f], e[f]);
}

// One frame: as many copies of it as the test-only fault `frames` says (one without it).
CLIENT3_HANDLER(GetTrajectoryAtFrame, Read) {
  Trajectory t = TrajectoryOf(context.scene, in);
  std::size_t f = FrameIndex(context.scene, in.Get<std::int32_t>());
  auto n = static_cast<std::size_t>(context.faults.framesPerFrame());
  out.Put(std::vector<double>(n, t.x.values[f])), out.Put(std::vector<double>(n, t.y.values[f]));
  out.Put(std::vector<double>(n, t.z.values[f]));
  out.Put(std::vector<bool>(n, t.Seen(f)));
}

CLIENT3_HANDLER(SetTrajectoryAtFrame, Write) {
  Trajectory t = TrajectoryOf(context.scene, in);
  std::size_t f = FrameIndex(context.scene, in.Get<std::int32_t>());
  double x = in.Get<double>(), y = in.Get<double>(), z = in.Get<double>();
  t.Set(f, x, y, z, in.Get<bool>());
}

}  // namespace client3::host
