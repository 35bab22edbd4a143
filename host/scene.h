// The application's scene: one take of motion-capture data with its subjects, their markers'
// trajectories, skeletons and parameters.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace client3::host {

// Frames are numbered from 1 to the take's frame count.
struct Marker {
  std::string name;
  std::vector<double> x, y, z;  // millimetres; 0 where the marker was not seen
  std::vector<bool> e;          // whether the marker was seen at each frame
};

struct Bone {
  std::string name;
  std::string parent;  // empty for the root
  std::vector<std::string> children;
};

struct Constraint {
  std::string name;
  bool active = true;
  std::string source, target;  // a marker and the bone it is attached to
  std::vector<float> offset;   // the marker's position in the bone's frame, millimetres
  std::string type;            // "Point", "Aim" or "Orient"
};

struct SubjectParameter {
  std::string name;
  float value = 0, fallback = 0;
  std::string unit;
  bool required = false;
};

struct Subject {
  std::string name;
  std::string model;  // the subject's template; also the name of its skeleton
  bool active = true;
  std::vector<Marker> markers;
  std::vector<Bone> bones;
  std::vector<Constraint> constraints;
  std::vector<SubjectParameter> parameters;
};

struct Scene {
  std::string name;
  std::string path;
  int frames = 0;
  double rate = 100.0;
  std::vector<Subject> subjects;

  Subject* FindSubject(std::string_view name);
};

// The demonstration take: deterministic, smooth trajectories with a few occlusion gaps.
Scene DemoScene(int frames);
Scene EmptyScene(int frames);

template <class T>
T* FindNamed(std::vector<T>& list, std::string_view name) {
  for (T& item : list)
    if (item.name == name) return &item;
  return nullptr;
}

}  // namespace client3::host
