// What the processing stages share: points, the subject's marker tracks, their progress, and the
// outcome each works out before it writes; and the stages themselves, which the pipeline runs.
#pragma once

#include <array>
#include <cmath>
#include <functional>
#include <string>
#include <vector>

#include "host/commands/command.h"

namespace client3::host {

using Point = std::array<double, 3>;

inline Point operator+(Point a, const Point& b) { return {a[0] + b[0], a[1] + b[1], a[2] + b[2]}; }
inline Point operator-(Point a, const Point& b) { return {a[0] - b[0], a[1] - b[1], a[2] - b[2]}; }
inline Point operator*(Point a, double k) { return {a[0] * k, a[1] * k, a[2] * k}; }
inline double Distance(const Point& a, const Point& b) { return std::hypot(a[0] - b[0], a[1] - b[1], a[2] - b[2]); }
inline double Squared(const Point& a, const Point& b) {
  Point d = a - b;
  return d[0] * d[0] + d[1] * d[1] + d[2] * d[2];
}
inline std::string PointText(const Point& p) { return VectorText({p[0], p[1], p[2]}); }
inline Point PointOf(std::string_view text) {
  std::vector<double> v = VectorOf(text);
  return {v[0], v[1], v[2]};
}

// A marker's trajectory, and the active constraint that ties it to a bone (the last one, when several
// do).
struct Track {
  Object* marker;
  std::string bone;  // the constraint's Target; empty when no constraint ties the marker
  Channel* axes[3];
  Object* constraint = nullptr;
  bool Seen(std::size_t f) const { return axes[0]->keys[f] && axes[1]->keys[f] && axes[2]->keys[f]; }
  Point At(std::size_t f) const { return {axes[0]->values[f], axes[1]->values[f], axes[2]->values[f]}; }
};

// The tracks of the subject's markers, in order.
std::vector<Track> TracksOf(Scene& scene, Object& subject);

// How far a stage has got. On takes of 10,000 frames or more it logs each tenth of its work; the
// test-only fault `stage-delay` makes it wait there.
class Progress {
 public:
  Progress(const Context& context, std::string what, std::size_t total);
  // `done` of the total units of work are done.
  void At(std::size_t done);
  void Done() { At(total_); }

 private:
  std::string what_;
  std::size_t total_, tenths_ = 0;
  int delay_;
  bool logged_;
};

// What a stage works out while the scene is shared with readers: the result it records, what it did
// in words (for the reply), and the change it makes, written once it holds the scene alone.
struct Outcome {
  std::string result;
  std::string summary;
  std::function<void()> write;
};

// "subject 'NAME'", for messages.
std::string Quoted(const Object& subject);
// Sets the object's Text parameter `name`, made when it has none.
void SetText(Object& object, const std::string& name, std::string value);

// The stages, each for one subject (labelling.cpp, occlusion.cpp, solving.cpp).
Outcome LabelROM(Scene& scene, Object& subject, Progress& progress);
Outcome CalibrateLabelingSubjects(Scene& scene, Object& subject, Progress& progress);
Outcome AutoLabel(Scene& scene, Object& subject, Progress& progress);
Outcome FixOcclusion(Scene& scene, Object& subject, Progress& progress);  // progress by marker
Outcome CreateSolvingSetup(Scene& scene, Object& subject);
Outcome CalibrateSolvingSubjects(Scene& scene, Object& subject, Progress& progress);
Outcome Solve(Scene& scene, Object& subject, Progress& progress);
Outcome Retarget(Scene& scene, Object& subject, Progress& progress);  // progress by bone

}  // namespace client3::host
