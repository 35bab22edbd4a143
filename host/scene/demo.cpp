// The scenes the application starts with: the demonstration take and an empty one.
#include <algorithm>
#include <cmath>

#include "host/scene/scene.h"

namespace client3::host {

Scene EmptyScene(int frames) {
  Scene scene(frames, "Untitled");
  Object& clip = scene.Add(scene.root, "Clip", "Take");
  scene.activeClip = clip.id;
  return scene;
}

namespace {

constexpr double kPi = 3.14159265358979323846;
constexpr double kDemoRate = 100;

// Where each marker sits on the body (millimetres from the pelvis, standing), the bone it belongs to,
// and how it swings while walking.
struct MarkerPlan {
  const char* name;
  const char* bone;
  double x, y, z;    // rest position: x forward, y left, z up
  double swing;      // amplitude of the forward swing in millimetres
  double phase;      // phase of the swing in the gait cycle, radians
};

constexpr MarkerPlan kMarkers[] = {
    {"LFHD", "Head", 80, 60, 700, 5, 0.0},        {"RFHD", "Head", 80, -60, 700, 5, 0.0},
    {"C7", "Thorax", -60, 0, 520, 8, 0.0},        {"STRN", "Thorax", 90, 0, 350, 8, 0.0},
    {"LASI", "Pelvis", 70, 120, 0, 10, 0.0},      {"RASI", "Pelvis", 70, -120, 0, 10, 0.0},
    {"LWRA", "LeftHand", 0, 230, 50, 180, kPi},   {"RWRA", "RightHand", 0, -230, 50, 180, 0.0},
    {"LKNE", "LeftShin", 40, 100, -450, 150, 0.0}, {"RKNE", "RightShin", 40, -100, -450, 150, kPi},
    {"LANK", "LeftFoot", 0, 100, -880, 300, 0.0},  {"RANK", "RightFoot", 0, -100, -880, 300, kPi},
};

// Bones with their parent and their offset from it (millimetres, standing).
struct BonePlan {
  const char* name;
  const char* parent;
  double x, y, z;
};
constexpr BonePlan kBones[] = {
    {"Pelvis", "", 0, 0, 950},          {"Thorax", "Pelvis", 0, 0, 300},      {"Head", "Thorax", 0, 0, 300},
    {"LeftArm", "Thorax", 0, 180, 200}, {"LeftHand", "LeftArm", 0, 50, -550}, {"RightArm", "Thorax", 0, -180, 200},
    {"RightHand", "RightArm", 0, -50, -550}, {"LeftThigh", "Pelvis", 0, 100, 0}, {"LeftShin", "LeftThigh", 0, 0, -450},
    {"LeftFoot", "LeftShin", 0, 0, -430}, {"RightThigh", "Pelvis", 0, -100, 0}, {"RightShin", "RightThigh", 0, 0, -450},
    {"RightFoot", "RightShin", 0, 0, -430},
};

// Occlusions: marker index, first frame, length (in frames of a 1,000-frame take; scaled to others).
struct GapPlan {
  int marker, first, length;
};

struct SubjectPlan {
  const char* name;
  double height;   // scales the body
  double lane;     // sideways offset of the walk, millimetres
  double speed;    // walking speed, millimetres per second
  double cadence;  // gait cycles per second
  GapPlan gaps[4];
};

constexpr SubjectPlan kSubjects[] = {
    {"Alice", 1.68, 600, 1200, 0.9, {{6, 120, 12}, {11, 400, 35}, {2, 700, 6}, {7, 850, 80}}},
    {"Bob", 1.82, -600, 1350, 0.85, {{10, 250, 20}, {3, 520, 4}, {8, 610, 45}, {6, 900, 15}}},
};

Parameter NumberParameter(const char* name, double value, double fallback, const char* unit, bool required) {
  return {NewId(), name, ParameterKind::Number, NumberText(static_cast<float>(value)), NumberText(static_cast<float>(fallback)), unit, required};
}

void AddSubject(Scene& scene, const SubjectPlan& plan) {
  int frames = scene.frames;
  Object& subject = scene.Add(scene.root, "Subject", plan.name);
  ObjectId subjectId = subject.id;
  subject.FindAttribute("Model")->value = "Walker";
  double scale = plan.height / 1.75;
  double hip = 950 * scale;
  std::vector<ObjectId> markers;
  for (const MarkerPlan& m : kMarkers) {
    Object& marker = scene.Add(subjectId, "Marker", m.name);
    markers.push_back(marker.id);
    Channel &x = marker.channels[0], &y = marker.channels[1], &z = marker.channels[2];
    for (int f = 0; f < frames; ++f) {
      double t = f / kDemoRate;
      double cycle = 2 * kPi * plan.cadence * t + m.phase;
      auto i = static_cast<std::size_t>(f);
      x.SetKey(i, -2000 + plan.speed * t + m.x * scale + m.swing * scale * std::sin(cycle));
      y.SetKey(i, plan.lane + m.y * scale + 15 * std::sin(cycle / 2));
      z.SetKey(i, hip + m.z * scale + 20 * std::abs(std::sin(cycle)));
    }
  }
  for (const GapPlan& gap : plan.gaps) {
    Object& marker = scene.objects.at(markers[static_cast<std::size_t>(gap.marker)]);
    long first = static_cast<long>(gap.first) * frames / 1000;
    long length = std::max(1L, static_cast<long>(gap.length) * frames / 1000);
    for (long f = first; f < first + length && f < frames; ++f)
      for (Channel& c : marker.channels) c.DeleteKey(static_cast<std::size_t>(f)), c.values[static_cast<std::size_t>(f)] = 0;
  }
  for (const BonePlan& b : kBones) {
    ObjectId parentId = subjectId;
    for (Object* bone : scene.Bones(scene.objects.at(subjectId)))
      if (bone->name == b.parent) parentId = bone->id;
    Object& bone = scene.Add(parentId, "Bone", b.name);
    bone.FindAttribute("Translation")->value = VectorText({b.x * scale, b.y * scale, b.z * scale});
  }
  for (const MarkerPlan& m : kMarkers) {
    Object& c = scene.Add(subjectId, "Constraint", std::string(m.name) + "_" + m.bone);
    c.FindAttribute("Source")->value = m.name;
    c.FindAttribute("Target")->value = m.bone;
    c.FindAttribute("Offset")->value = NumberText(static_cast<float>(m.x * scale / 4)) + "," + NumberText(static_cast<float>(m.y * scale / 4)) + ",0";
  }
  scene.objects.at(subjectId).parameters = {
      NumberParameter("Height", plan.height * 1000, 1750, "mm", true),
      NumberParameter("Mass", plan.height * 40, 70, "kg", true),
      NumberParameter("LeftLegLength", hip, 900, "mm", false),
      NumberParameter("RightLegLength", hip, 900, "mm", false),
  };
}

}  // namespace

Scene DemoScene(int frames) {
  Scene scene(frames, "Demo");
  for (const SubjectPlan& plan : kSubjects) AddSubject(scene, plan);
  const double corners[4][2] = {{4000, 3000}, {4000, -3000}, {-4000, -3000}, {-4000, 3000}};
  for (int i = 0; i < 4; ++i) {
    Object& camera = scene.Add(scene.root, "Camera", "Camera" + std::to_string(i + 1));
    camera.FindAttribute("Translation")->value = VectorText({corners[i][0], corners[i][1], 2500});
  }
  Object& clip = scene.Add(scene.root, "Clip", "Walk");
  clip.FindAttribute("Description")->value = "Two subjects walking side by side";
  scene.activeClip = clip.id;
  return scene;
}

}  // namespace client3::host
