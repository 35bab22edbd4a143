// The scene and the demonstration take.
#include "host/scene.h"

#include <cmath>

namespace client3::host {

Subject* Scene::FindSubject(std::string_view name) { return FindNamed(subjects, name); }

Scene EmptyScene(int frames) {
  Scene scene;
  scene.name = "Untitled";
  scene.frames = frames;
  return scene;
}

namespace {

constexpr double kPi = 3.14159265358979323846;

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

struct BonePlan {
  const char* name;
  const char* parent;
};
constexpr BonePlan kBones[] = {
    {"Pelvis", ""},          {"Thorax", "Pelvis"},      {"Head", "Thorax"},         {"LeftArm", "Thorax"},
    {"LeftHand", "LeftArm"}, {"RightArm", "Thorax"},    {"RightHand", "RightArm"},  {"LeftThigh", "Pelvis"},
    {"LeftShin", "LeftThigh"}, {"LeftFoot", "LeftShin"}, {"RightThigh", "Pelvis"},  {"RightShin", "RightThigh"},
    {"RightFoot", "RightShin"},
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

Subject MakeSubject(const SubjectPlan& plan, int frames, double rate) {
  Subject subject;
  subject.name = plan.name;
  subject.model = "Walker";
  double scale = plan.height / 1.75;
  double hip = 950 * scale;
  for (const MarkerPlan& m : kMarkers) {
    Marker marker;
    marker.name = m.name;
    marker.x.resize(frames), marker.y.resize(frames), marker.z.resize(frames);
    marker.e.assign(frames, true);
    for (int f = 0; f < frames; ++f) {
      double t = f / rate;
      double cycle = 2 * kPi * plan.cadence * t + m.phase;
      marker.x[f] = -2000 + plan.speed * t + m.x * scale + m.swing * scale * std::sin(cycle);
      marker.y[f] = plan.lane + m.y * scale + 15 * std::sin(cycle / 2);
      marker.z[f] = hip + m.z * scale + 20 * std::abs(std::sin(cycle)) ;
    }
    subject.markers.push_back(std::move(marker));
  }
  for (const GapPlan& gap : plan.gaps) {
    Marker& marker = subject.markers[gap.marker];
    long first = static_cast<long>(gap.first) * frames / 1000;
    long length = std::max(1L, static_cast<long>(gap.length) * frames / 1000);
    for (long f = first; f < first + length && f < frames; ++f) {
      marker.e[f] = false;
      marker.x[f] = marker.y[f] = marker.z[f] = 0;
    }
  }
  for (const BonePlan& b : kBones) subject.bones.push_back({b.name, b.parent, {}});
  for (Bone& bone : subject.bones)
    if (Bone* parent = FindNamed(subject.bones, bone.parent)) parent->children.push_back(bone.name);
  for (const MarkerPlan& m : kMarkers) {
    float offset[3] = {static_cast<float>(m.x * scale / 4), static_cast<float>(m.y * scale / 4), 0};
    subject.constraints.push_back(
        {std::string(m.name) + "_" + m.bone, true, m.name, m.bone, {offset, offset + 3}, "Point"});
  }
  subject.parameters = {
      {"Height", static_cast<float>(plan.height * 1000), 1750, "mm", true},
      {"Mass", static_cast<float>(plan.height * 40), 70, "kg", true},
      {"LeftLegLength", static_cast<float>(hip), 900, "mm", false},
      {"RightLegLength", static_cast<float>(hip), 900, "mm", false},
  };
  return subject;
}

}  // namespace

Scene DemoScene(int frames) {
  Scene scene = EmptyScene(frames);
  scene.name = "Demo";
  for (const SubjectPlan& plan : kSubjects) scene.subjects.push_back(MakeSubject(plan, frames, scene.rate));
  return scene;
}

}  // namespace client3::host
