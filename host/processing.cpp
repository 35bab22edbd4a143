// The offline processing stages: labelling, occlusion fixing, solving and retargeting of the take's
// trajectories, and the pipeline that keeps what has run.
#include <algorithm>
#include <array>
#include <chrono>
#include <cmath>
#include <functional>
#include <memory>
#include <optional>
#include <thread>

#include "host/handlers.h"

namespace client3::host {

using protocol::Id;
using protocol::Reader;
using protocol::Writer;

namespace {

using Point = std::array<double, 3>;

Point operator+(Point a, const Point& b) { return {a[0] + b[0], a[1] + b[1], a[2] + b[2]}; }
Point operator-(Point a, const Point& b) { return {a[0] - b[0], a[1] - b[1], a[2] - b[2]}; }
Point operator*(Point a, double k) { return {a[0] * k, a[1] * k, a[2] * k}; }
double Distance(const Point& a, const Point& b) { return std::hypot(a[0] - b[0], a[1] - b[1], a[2] - b[2]); }
double Squared(const Point& a, const Point& b) {
  Point d = a - b;
  return d[0] * d[0] + d[1] * d[1] + d[2] * d[2];
}
std::string PointText(const Point& p) { return NumberText(p[0]) + "," + NumberText(p[1]) + "," + NumberText(p[2]); }
Point PointOf(const std::string& text) {
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

std::vector<Track> TracksOf(Scene& scene, Object& subject) {
  std::vector<Track> tracks;
  for (Object* m : scene.OfType(subject, "Marker")) {
    Channel *x = m->FindChannel("X"), *y = m->FindChannel("Y"), *z = m->FindChannel("Z");
    if (!x || !y || !z) continue;
    Track t{m, {}, {x, y, z}};
    for (Object* c : scene.OfType(subject, "Constraint"))
      if (c->Text("Active") == "true" && c->Text("Source") == m->name) t.bone = c->Text("Target"), t.constraint = c;
    tracks.push_back(t);
  }
  return tracks;
}

// How far a stage has got. On takes of kLoggedFrames frames or more it logs each tenth of its work;
// the test-only fault `stage-delay` makes it wait there.
constexpr std::size_t kLoggedFrames = 10000;

class Progress {
 public:
  Progress(const Context& context, std::string what, std::size_t total)
      : what_(std::move(what)), total_(std::max<std::size_t>(total, 1)), delay_(context.faults.stageDelay),
        logged_(static_cast<std::size_t>(context.scene.frames) >= kLoggedFrames) {}
  // `done` of the total units of work are done.
  void At(std::size_t done) {
    for (std::size_t tenth = done * 10 / total_; tenths_ < tenth;) {
      ++tenths_;
      if (logged_) LogLine("info", what_ + ": " + std::to_string(tenths_ * 10) + "% done");
      if (delay_ > 0) std::this_thread::sleep_for(std::chrono::milliseconds(delay_));
    }
  }
  void Done() { At(total_); }

 private:
  std::string what_;
  std::size_t total_, tenths_ = 0;
  int delay_;
  bool logged_;
};

// One gap's filled positions, or nothing when the gap cannot be filled.
struct Fill {
  const Track* track;
  std::size_t first, end;  // the frames [first, end)
  std::vector<double> values[3];
};

// Rigid fill from a marker of the same segment that is seen across the gap and at both frames
// beside it: the neighbour's motion plus the offset between the two markers, blended linearly from
// its value before the gap to its value after it.
bool FromNeighbour(const std::vector<Track>& tracks, Fill& fill) {
  const Track& t = *fill.track;
  std::size_t before = fill.first - 1, after = fill.end;
  for (const Track& n : tracks) {
    if (&n == &t || n.bone.empty() || n.bone != t.bone) continue;
    bool seen = true;
    for (std::size_t f = before; f <= after && seen; ++f) seen = n.Seen(f);
    if (!seen) continue;
    double span = static_cast<double>(after - before);
    for (int a = 0; a < 3; ++a) {
      const Channel &c = *t.axes[a], &nc = *n.axes[a];
      double from = c.values[before] - nc.values[before], to = c.values[after] - nc.values[after];
      for (std::size_t f = fill.first; f < fill.end; ++f)
        fill.values[a].push_back(nc.values[f] + from + (to - from) * static_cast<double>(f - before) / span);
    }
    return true;
  }
  return false;
}

// Cubic Hermite interpolation between the frames beside the gap, with the slopes of the data there:
// from the two frames further out where both are seen (second-order differences), from one where
// only that one is, else the straight line's slope.
void Cubic(Fill& fill, std::size_t frames) {
  const Track& t = *fill.track;
  std::size_t before = fill.first - 1, after = fill.end;
  double span = static_cast<double>(after - before);
  for (int a = 0; a < 3; ++a) {
    const Channel& c = *t.axes[a];
    double p0 = c.values[before], p1 = c.values[after], line = (p1 - p0) / span;
    double m0 = line, m1 = line;
    if (before >= 2 && t.Seen(before - 1) && t.Seen(before - 2))
      m0 = (3 * p0 - 4 * c.values[before - 1] + c.values[before - 2]) / 2;
    else if (before >= 1 && t.Seen(before - 1))
      m0 = p0 - c.values[before - 1];
    if (after + 2 < frames && t.Seen(after + 1) && t.Seen(after + 2))
      m1 = (4 * c.values[after + 1] - 3 * p1 - c.values[after + 2]) / 2;
    else if (after + 1 < frames && t.Seen(after + 1))
      m1 = c.values[after + 1] - p1;
    for (std::size_t f = fill.first; f < fill.end; ++f) {
      double s = static_cast<double>(f - before) / span, s2 = s * s, s3 = s2 * s;
      fill.values[a].push_back((2 * s3 - 3 * s2 + 1) * p0 + (s3 - 2 * s2 + s) * span * m0 + (-2 * s3 + 3 * s2) * p1 +
                               (s3 - s2) * span * m1);
    }
  }
}


// The subjects a stage works on: the one named, or every subject for an empty name.
std::vector<Object*> SubjectsOf(Scene& scene, std::string_view name) {
  if (name.empty()) return scene.OfType(scene.Root(), "Subject");
  if (Object* s = scene.FindSubject(name)) return {s};
  Refuse("no subject named '" + std::string(name) + "'");
}

void NoOptions(std::string_view command, std::string_view options) {
  if (!options.empty()) Refuse("'" + std::string(command) + "' takes no options: '" + std::string(options) + "'");
}

void SetText(Object& object, const std::string& name, std::string value) {
  Parameter* p = object.FindParameter(name);
  if (!p) object.parameters.push_back({NewId(), name, ParameterKind::Text, "", "", "", false}), p = &object.parameters.back();
  p->value = std::move(value);
}

// What a stage works out while the scene is shared with readers: the result it records, what it did
// in words (for the reply), and the change it makes, written once it holds the scene alone.
struct Outcome {
  std::string result;
  std::string summary;
  std::function<void()> write;
};

std::string Quoted(const Object& subject) { return "subject '" + subject.name + "'"; }

// ---- Labelling ----------------------------------------------------------------------------------
//
// A subject's label template is the `Template` Text parameter of each of its markers: "x,y,z,reach",
// where the marker sits relative to the centroid of the subject's markers and how far from there a
// point may lie and still take the marker's label. A marker of the subject without a template holds
// an unlabelled trajectory.

constexpr std::string_view kTemplate = "Template";

struct Label {
  Point offset;
  double reach;
};

std::optional<Label> LabelOf(Object& marker) {
  Parameter* p = marker.FindParameter(kTemplate);
  if (!p || p->kind != ParameterKind::Text) return std::nullopt;
  std::string_view text = p->value;
  double v[4];
  for (double& each : v) {
    std::size_t comma = std::min(text.find(','), text.size());
    std::optional<double> number = ParseDouble(text.substr(0, comma));
    if (!number) return std::nullopt;
    each = *number;
    text.remove_prefix(std::min(comma + 1, text.size()));
  }
  return Label{{v[0], v[1], v[2]}, v[3]};
}

Point Centroid(const std::vector<Track>& tracks, std::size_t f) {
  Point sum{};
  for (const Track& t : tracks) sum = sum + t.At(f);
  return sum * (1.0 / static_cast<double>(tracks.size()));
}

// The template from the take as it is labelled: over the frames where every marker is seen, the mean
// of each marker's offset from the centroid, leaving out the frames where it lies further than
// StandardDeviation times its spread (the root mean square distance from the first mean) from that
// mean. The reach is StandardDeviation spreads, and at least SeparationDistance.
Outcome LabelROM(Scene& scene, Object& subject, Progress& progress) {
  std::vector<Track> tracks = TracksOf(scene, subject);
  if (tracks.empty()) Refuse(Quoted(subject) + " has no markers to label");
  auto frames = static_cast<std::size_t>(scene.frames);
  std::vector<std::size_t> whole;
  std::vector<Point> centroids;
  for (std::size_t f = 0; f < frames; ++f) {
    progress.At(f);
    if (std::all_of(tracks.begin(), tracks.end(), [f](const Track& t) { return t.Seen(f); }))
      whole.push_back(f), centroids.push_back(Centroid(tracks, f));
  }
  if (whole.empty()) Refuse("no frame of the take sees every marker of " + Quoted(subject));
  double deviations = scene.settings.Number(Record::LabelROM, "StandardDeviation");
  double separation = scene.settings.Number(Record::LabelROM, "SeparationDistance");
  std::vector<Label> labels;
  for (const Track& t : tracks) {
    auto offset = [&](std::size_t i) { return t.At(whole[i]) - centroids[i]; };
    Point mean{};
    for (std::size_t i = 0; i < whole.size(); ++i) mean = mean + offset(i);
    mean = mean * (1.0 / static_cast<double>(whole.size()));
    double square = 0;
    for (std::size_t i = 0; i < whole.size(); ++i) square += Squared(offset(i), mean);
    double spread = std::sqrt(square / static_cast<double>(whole.size()));
    Point kept{};
    std::size_t count = 0;
    for (std::size_t i = 0; i < whole.size(); ++i)
      if (Squared(offset(i), mean) <= square / static_cast<double>(whole.size()) * deviations * deviations) kept = kept + offset(i), ++count;
    labels.push_back({count ? kept * (1.0 / static_cast<double>(count)) : mean, std::max(deviations * spread, separation)});
  }
  for (std::size_t a = 0; a < tracks.size(); ++a)
    for (std::size_t b = a + 1; b < tracks.size(); ++b)
      if (Distance(labels[a].offset, labels[b].offset) < separation)
        Refuse("markers '" + tracks[a].marker->name + "' and '" + tracks[b].marker->name + "' of " + Quoted(subject) +
               " lie closer together than the LabelROM setting 'SeparationDistance' (" + NumberText(separation) + " mm)");
  progress.Done();
  return {"markers=" + std::to_string(tracks.size()) + ",frames=" + std::to_string(whole.size()),
          "label template of " + Count(tracks.size(), "marker") + " made from " + Count(whole.size(), "frame"), [tracks, labels] {
            for (std::size_t i = 0; i < tracks.size(); ++i)
              SetText(*tracks[i].marker, std::string(kTemplate), PointText(labels[i].offset) + "," + NumberText(labels[i].reach));
          }};
}

// Gives each label the nearest free point to `centre` + its offset, within its reach unless
// `anywhere`, the closest pairs first; `taken[label]` is the point's index, or -1. When no two
// labels have the same nearest point, that is each label's nearest point, found without sorting.
struct Pairing {
  double distance;  // squared
  std::size_t label, point;
  bool operator<(const Pairing& o) const {
    return distance != o.distance ? distance < o.distance : label != o.label ? label < o.label : point < o.point;
  }
};

struct Assignment {
  std::vector<Pairing> pairs;
  std::vector<int> taken;
  std::vector<bool> used;

  void Assign(const std::vector<Label>& labels, const Point& centre, bool anywhere, const std::vector<Point>& points) {
    pairs.clear();
    taken.assign(labels.size(), -1);
    used.assign(points.size(), false);
    bool shared = false;
    for (std::size_t l = 0; l < labels.size(); ++l) {
      Point at = centre + labels[l].offset;
      double reach = labels[l].reach * labels[l].reach, best = 0;
      for (std::size_t p = 0; p < points.size(); ++p) {
        double d = Squared(points[p], at);
        if (!anywhere && d > reach) continue;
        pairs.push_back({d, l, p});
        if (taken[l] < 0 || d < best) taken[l] = static_cast<int>(p), best = d;
      }
      if (taken[l] >= 0) {
        shared = shared || used[static_cast<std::size_t>(taken[l])];
        used[static_cast<std::size_t>(taken[l])] = true;
      }
    }
    if (!shared) return;
    std::sort(pairs.begin(), pairs.end());
    taken.assign(labels.size(), -1);
    used.assign(points.size(), false);
    for (const Pairing& pair : pairs)
      if (taken[pair.label] < 0 && !used[pair.point]) taken[pair.label] = static_cast<int>(pair.point), used[pair.point] = true;
  }
};

// Labels every frame on its own: the points are the positions of the subject's markers seen there,
// labelled or not. Three passes place the template: where it was placed at the frame before (at the
// first frame, or after one without points: the points' median less the offsets' median, per axis),
// pairing labels and points regardless of reach; at the median (per axis) of where those pairs put
// it, now within reach; and at the mean of where the second pass's pairs put it. A label without a point in reach
// leaves its marker unseen at that frame. The points no label takes go to the unlabelled markers, in order;
// those that find no unlabelled marker are dropped.
Outcome AutoLabel(Scene& scene, Object& subject, Progress& progress) {
  std::vector<Track> tracks = TracksOf(scene, subject), labelled, unlabelled;
  std::vector<Label> labels;
  for (const Track& t : tracks) {
    if (std::optional<Label> label = LabelOf(*t.marker)) labels.push_back(*label), labelled.push_back(t);
    else unlabelled.push_back(t);
  }
  if (labels.empty()) Refuse(Quoted(subject) + " has no label template: 'OfflineLabelROM' must run first");
  std::vector<Track> order = labelled;  // the markers that receive points: labelled first, then the rest
  order.insert(order.end(), unlabelled.begin(), unlabelled.end());
  auto frames = static_cast<std::size_t>(scene.frames);
  // The new trajectories, starting from the old ones; a frame that loses its point keeps its values.
  struct Result {
    std::vector<double> values[3];
    std::vector<bool> seen;
  };
  std::vector<Result> results(order.size());
  for (std::size_t i = 0; i < order.size(); ++i) {
    for (int a = 0; a < 3; ++a) results[i].values[a] = order[i].axes[a]->values;
    results[i].seen.assign(frames, false);
  }
  std::vector<double> axis;
  auto median = [&axis] {
    std::nth_element(axis.begin(), axis.begin() + static_cast<std::ptrdiff_t>(axis.size() / 2), axis.end());
    return axis[axis.size() / 2];
  };
  Point middle;  // the offsets' median
  for (std::size_t a = 0; a < 3; ++a) {
    axis.clear();
    for (const Label& l : labels) axis.push_back(l.offset[a]);
    middle[a] = median();
  }
  std::optional<Point> last;  // where the template was placed at the frame before
  std::vector<Point> points;
  std::vector<std::size_t> from;
  Assignment assignment;
  const std::vector<int>& taken = assignment.taken;
  std::vector<bool> used;
  std::size_t assigned = 0, moved = 0, dropped = 0;
  for (std::size_t f = 0; f < frames; ++f) {
    progress.At(f);
    points.clear(), from.clear();
    for (std::size_t i = 0; i < order.size(); ++i)
      if (order[i].Seen(f)) points.push_back(order[i].At(f)), from.push_back(i);
    if (points.empty()) {
      last.reset();
      continue;
    }
    Point centre;
    for (std::size_t a = 0; a < 3 && !last; ++a) {
      axis.clear();
      for (const Point& p : points) axis.push_back(p[a]);
      centre[a] = median() - middle[a];
    }
    assignment.Assign(labels, last ? *last : centre, true, points);
    for (std::size_t a = 0; a < 3; ++a) {
      axis.clear();
      for (std::size_t l = 0; l < labels.size(); ++l)
        if (taken[l] >= 0) axis.push_back(points[static_cast<std::size_t>(taken[l])][a] - labels[l].offset[a]);
      centre[a] = median();
    }
    assignment.Assign(labels, centre, false, points);
    Point sum{};
    std::size_t count = 0;
    for (std::size_t l = 0; l < labels.size(); ++l)
      if (taken[l] >= 0) sum = sum + (points[static_cast<std::size_t>(taken[l])] - labels[l].offset), ++count;
    if (count) assignment.Assign(labels, centre = sum * (1.0 / static_cast<double>(count)), false, points);
    last = centre;
    used.assign(points.size(), false);
    auto put = [&](std::size_t marker, std::size_t point) {
      for (int a = 0; a < 3; ++a) results[marker].values[a][f] = points[point][static_cast<std::size_t>(a)];
      results[marker].seen[f] = true;
      used[point] = true;
    };
    for (std::size_t l = 0; l < labels.size(); ++l)
      if (taken[l] >= 0) put(l, static_cast<std::size_t>(taken[l])), ++assigned, moved += from[static_cast<std::size_t>(taken[l])] != l;
    std::size_t next = labels.size();
    for (std::size_t p = 0; p < points.size(); ++p) {
      if (used[p]) continue;
      if (next < order.size()) put(next++, p);
      else ++dropped;
    }
  }
  progress.Done();
  std::string result = "labelled=" + std::to_string(assigned) + ",moved=" + std::to_string(moved) + ",dropped=" + std::to_string(dropped);
  std::string summary = Count(assigned, "label") + " given, " + std::to_string(moved) + " of them to a point another marker held; " +
                        Count(dropped, "point") + " dropped";
  return {result, summary, [order, results = std::move(results)] {
            for (std::size_t i = 0; i < order.size(); ++i) {
              for (int a = 0; a < 3; ++a) {
                Channel& c = *order[i].axes[a];
                c.values = results[i].values[a];
                for (std::size_t f = 0; f < c.keys.size(); ++f)
                  if (results[i].seen[f]) c.keys[f] = true;
                  else c.DeleteKey(f);
              }
            }
          }};
}

// ---- Occlusion fixing ---------------------------------------------------------------------------

Outcome FixOcclusion(Scene& scene, Object& subject, Progress& progress) {
  const Settings& settings = scene.settings;
  double longest = std::floor(settings.Number(Record::OcclusionFixing, "TransitionTime") * scene.timeline.rate + 1e-9);
  bool apply = settings.Flag(Record::OcclusionFixing, "ApplyFixedMarkers");
  auto frames = static_cast<std::size_t>(scene.frames);
  std::size_t rigid = 0, longer = 0, ends = 0;
  auto tracks = std::make_shared<std::vector<Track>>(TracksOf(scene, subject));
  // Every fill is worked out from the data as it was, then written.
  std::vector<Fill> fills;
  for (std::size_t i = 0; i < tracks->size(); ++i) {
    progress.At(i);
    const Track& t = (*tracks)[i];
    for (std::size_t f = 0; f < frames;) {
      if (t.Seen(f)) {
        ++f;
        continue;
      }
      std::size_t end = f;
      while (end < frames && !t.Seen(end)) ++end;
      if (f == 0 || end == frames || static_cast<double>(end - f) > longest) {
        ++(f == 0 || end == frames ? ends : longer), f = end;
        continue;
      }
      Fill fill{&t, f, end, {}};
      if (FromNeighbour(*tracks, fill)) ++rigid;
      else Cubic(fill, frames);
      fills.push_back(std::move(fill));
      f = end;
    }
  }
  progress.Done();
  std::string result = "filled=" + std::to_string(fills.size()) + ",rigid=" + std::to_string(rigid) +
                       ",left=" + std::to_string(longer + ends);
  std::string summary = Count(fills.size(), "gap") + " filled (" + std::to_string(rigid) + " from a marker of the same segment, " +
                        std::to_string(fills.size() - rigid) + " by cubic interpolation), " + std::to_string(longer + ends) +
                        " left (" + std::to_string(longer) + " longer than " + Count(static_cast<std::size_t>(longest), "frame") +
                        ", " + std::to_string(ends) + " at an end of the take)";
  if (!apply) summary += "; the filled frames stay unseen (ApplyFixedMarkers is off)";
  return {result, summary, [tracks, fills = std::move(fills), apply] {
            for (const Fill& fill : fills) {
              for (int a = 0; a < 3; ++a) {
                Channel& c = *fill.track->axes[a];
                for (std::size_t f = fill.first; f < fill.end; ++f) {
                  if (apply) c.SetKey(f, fill.values[a][f - fill.first]);
                  else c.values[f] = fill.values[a][f - fill.first];
                }
              }
            }
          }};
}

// ---- Solving ------------------------------------------------------------------------------------
//
// A bone's position at a frame, as its markers put it: the mean over its seen markers of the marker's
// position less its constraint's Offset. Nothing where none of them is seen.

struct Segment {
  Object* bone;
  int parent;  // index of the parent bone among the segments; -1 for a root
  std::vector<const Track*> markers;
};

std::vector<Segment> SegmentsOf(Scene& scene, Object& subject, const std::vector<Track>& tracks) {
  std::vector<Segment> segments;
  for (Object* bone : scene.Bones(subject)) {
    Segment s{bone, -1, {}};
    for (std::size_t i = 0; i < segments.size(); ++i)
      if (segments[i].bone->id == bone->parent) s.parent = static_cast<int>(i);
    for (const Track& t : tracks)
      if (t.bone == bone->name) s.markers.push_back(&t);
    segments.push_back(std::move(s));
  }
  return segments;
}

std::optional<Point> Measured(const Segment& s, const std::vector<Point>& offsets, const std::vector<Track>& tracks, std::size_t f) {
  Point sum{};
  std::size_t seen = 0;
  for (const Track* t : s.markers)
    if (t->Seen(f)) sum = sum + (t->At(f) - offsets[static_cast<std::size_t>(t - tracks.data())]), ++seen;
  if (!seen) return std::nullopt;
  return sum * (1.0 / static_cast<double>(seen));
}

std::vector<Point> OffsetsOf(const std::vector<Track>& tracks) {
  std::vector<Point> offsets;
  for (const Track& t : tracks) offsets.push_back(t.constraint ? PointOf(t.constraint->Text("Offset")) : Point{});
  return offsets;
}

// Labelling-subject calibration: each constraint's Offset becomes the mean offset of its marker from
// the centre of the markers of its bone, over the first ActiveFrames frames where every marker tied
// to a bone is seen.
Outcome CalibrateLabelingSubjects(Scene& scene, Object& subject, Progress& progress) {
  std::vector<Track> tracks = TracksOf(scene, subject), tied;
  for (const Track& t : tracks)
    if (t.constraint) tied.push_back(t);
  if (tied.empty()) Refuse(Quoted(subject) + " has no marker tied to a bone by a constraint");
  auto wanted = static_cast<std::size_t>(scene.settings.Number(Record::LabelingSubjectCalibration, "ActiveFrames"));
  auto frames = static_cast<std::size_t>(scene.frames);
  std::vector<Point> sums(tied.size());
  std::size_t used = 0;
  for (std::size_t f = 0; f < frames && used < wanted; ++f) {
    progress.At(f);
    if (!std::all_of(tied.begin(), tied.end(), [f](const Track& t) { return t.Seen(f); })) continue;
    ++used;
    for (std::size_t i = 0; i < tied.size(); ++i) {
      Point centre{};
      double n = 0;
      for (const Track& t : tied)
        if (t.bone == tied[i].bone) centre = centre + t.At(f), ++n;
      sums[i] = sums[i] + (tied[i].At(f) - centre * (1 / n));
    }
  }
  if (!used) Refuse("no frame of the take sees every marker of " + Quoted(subject) + " that a constraint ties to a bone");
  progress.Done();
  return {"constraints=" + std::to_string(tied.size()) + ",frames=" + std::to_string(used),
          "offsets of " + Count(tied.size(), "constraint") + " set from " + Count(used, "frame"), [tied, sums, used] {
            for (std::size_t i = 0; i < tied.size(); ++i)
              tied[i].constraint->FindAttribute("Offset")->value = PointText(sums[i] * (1.0 / static_cast<double>(used)));
          }};
}

// The solving setup: every active constraint must tie a marker of the subject to one of its bones.
Outcome CreateSolvingSetup(Scene& scene, Object& subject) {
  std::vector<Object*> bones = scene.Bones(subject), markers = scene.OfType(subject, "Marker");
  auto named = [](const std::vector<Object*>& list, const std::string& name) {
    return std::any_of(list.begin(), list.end(), [&](const Object* o) { return o->name == name; });
  };
  std::size_t constraints = 0;
  for (Object* c : scene.OfType(subject, "Constraint")) {
    if (c->Text("Active") != "true") continue;
    if (!named(markers, c->Text("Source")))
      Refuse("constraint '" + c->name + "' of " + Quoted(subject) + " ties marker '" + c->Text("Source") + "', which the subject does not have");
    if (!named(bones, c->Text("Target")))
      Refuse("constraint '" + c->name + "' of " + Quoted(subject) + " ties to bone '" + c->Text("Target") + "', which the subject does not have");
    ++constraints;
  }
  if (bones.empty()) Refuse(Quoted(subject) + " has no skeleton to solve");
  return {"bones=" + std::to_string(bones.size()) + ",constraints=" + std::to_string(constraints),
          Count(bones.size(), "bone") + " and " + Count(constraints, "constraint") + " checked", nullptr};
}

// Solving-subject calibration: the Translation of each bone whose position and whose parent's are
// both measured at some frame becomes the mean difference between them.
Outcome CalibrateSolvingSubjects(Scene& scene, Object& subject, Progress& progress) {
  std::vector<Track> tracks = TracksOf(scene, subject);
  std::vector<Segment> segments = SegmentsOf(scene, subject, tracks);
  std::vector<Point> offsets = OffsetsOf(tracks), sums(segments.size());
  std::vector<std::size_t> counts(segments.size());
  auto frames = static_cast<std::size_t>(scene.frames);
  std::vector<std::optional<Point>> at(segments.size());
  for (std::size_t f = 0; f < frames; ++f) {
    progress.At(f);
    for (std::size_t i = 0; i < segments.size(); ++i) {
      at[i] = Measured(segments[i], offsets, tracks, f);
      int parent = segments[i].parent;
      if (at[i] && parent >= 0 && at[static_cast<std::size_t>(parent)])
        sums[i] = sums[i] + (*at[i] - *at[static_cast<std::size_t>(parent)]), ++counts[i];
    }
  }
  progress.Done();
  std::size_t calibrated = static_cast<std::size_t>(std::count_if(counts.begin(), counts.end(), [](std::size_t n) { return n > 0; }));
  return {"bones=" + std::to_string(segments.size()) + ",calibrated=" + std::to_string(calibrated),
          "translations of " + std::to_string(calibrated) + " of " + Count(segments.size(), "bone") + " set", [segments, sums, counts] {
            for (std::size_t i = 0; i < segments.size(); ++i)
              if (counts[i]) segments[i].bone->FindAttribute("Translation")->value = PointText(sums[i] * (1.0 / static_cast<double>(counts[i])));
          }};
}

// Positions of one bone over the take, to be written to three of its channels.
struct BonePath {
  Object* bone;
  std::vector<double> values[3];
  std::vector<bool> keys;
};

// Writes each path into the bone's channels named `first` and the two after it in kBoneChannels,
// made when the bone has none.
std::function<void()> WritePaths(Scene& scene, std::vector<BonePath> paths, std::size_t first) {
  return [&scene, paths = std::move(paths), first] {
    for (const BonePath& path : paths) {
      for (std::size_t a = 0; a < 3; ++a) {
        std::string name(kBoneChannels[first + a]);
        Channel* c = path.bone->FindChannel(name);
        if (!c) c = &scene.AddChannel(*path.bone, name);
        c->values = path.values[a], c->keys = path.keys;
        for (std::size_t f = 0; f < c->keys.size(); ++f) c->selected[f] = c->selected[f] && c->keys[f];
      }
    }
  };
}

// Solving: a bone tied to markers is where they put it; a bone tied to none follows its parent at
// its Translation. The positions go to the bone's channels TX, TY and TZ, keyed where known.
Outcome Solve(Scene& scene, Object& subject, Progress& progress) {
  std::vector<Track> tracks = TracksOf(scene, subject);
  std::vector<Segment> segments = SegmentsOf(scene, subject, tracks);
  std::vector<Point> offsets = OffsetsOf(tracks), rest;
  auto frames = static_cast<std::size_t>(scene.frames);
  std::vector<BonePath> paths;
  for (const Segment& s : segments) {
    rest.push_back(PointOf(s.bone->Text("Translation")));
    BonePath path{s.bone, {}, std::vector<bool>(frames, false)};
    for (auto& v : path.values) v.assign(frames, 0);
    paths.push_back(std::move(path));
  }
  std::size_t whole = 0;
  for (std::size_t f = 0; f < frames; ++f) {
    progress.At(f);
    bool all = true;
    for (std::size_t i = 0; i < segments.size(); ++i) {
      std::optional<Point> p;
      int parent = segments[i].parent;
      if (!segments[i].markers.empty()) p = Measured(segments[i], offsets, tracks, f);
      else if (parent >= 0 && paths[static_cast<std::size_t>(parent)].keys[f]) {
        const BonePath& up = paths[static_cast<std::size_t>(parent)];
        p = Point{up.values[0][f], up.values[1][f], up.values[2][f]} + rest[i];
      }
      all = all && p;
      if (!p) continue;
      for (std::size_t a = 0; a < 3; ++a) paths[i].values[a][f] = (*p)[a];
      paths[i].keys[f] = true;
    }
    whole += all;
  }
  progress.Done();
  return {"bones=" + std::to_string(segments.size()) + ",frames=" + std::to_string(whole),
          Count(segments.size(), "bone") + " solved into TX, TY and TZ, every one of them placed at " + std::to_string(whole) + " of " +
              Count(frames, "frame"),
          WritePaths(scene, std::move(paths), 0)};
}

// Retargeting onto the model's standard figure, 1750 mm tall: each bone keeps the root bone's solved
// path, and its solved offset from the root is scaled by 1750 / Height. The positions go to the
// bone's channels RX, RY and RZ, keyed where the bone and the root are solved.
constexpr double kStandardHeight = 1750;

Outcome Retarget(Scene& scene, Object& subject, Progress& progress) {
  Parameter* height = subject.FindParameter("Height");
  std::optional<double> tall = height && height->kind == ParameterKind::Number ? ParseDouble(height->value) : std::nullopt;
  if (!tall || *tall <= 0) Refuse(Quoted(subject) + " has no positive Height parameter to retarget from");
  double scale = kStandardHeight / *tall;
  std::vector<Object*> bones = scene.Bones(subject);
  std::vector<Channel*> solved;
  for (Object* bone : bones)
    for (std::size_t a = 0; a < 3; ++a) {
      Channel* c = bone->FindChannel(kBoneChannels[a]);
      if (!c) Refuse("bone '" + bone->name + "' of " + Quoted(subject) + " has no solved channel '" + std::string(kBoneChannels[a]) + "'");
      solved.push_back(c);
    }
  auto frames = static_cast<std::size_t>(scene.frames);
  std::vector<BonePath> paths;
  for (std::size_t b = 0; b < bones.size(); ++b) {
    progress.At(b);
    BonePath path{bones[b], {}, std::vector<bool>(frames, false)};
    for (std::size_t a = 0; a < 3; ++a) {
      const Channel &own = *solved[b * 3 + a], &root = *solved[a];
      path.values[a].assign(frames, 0);
      for (std::size_t f = 0; f < frames; ++f) {
        path.keys[f] = own.keys[f] && root.keys[f] && (a == 0 || path.keys[f]);
        if (own.keys[f] && root.keys[f]) path.values[a][f] = root.values[f] + (own.values[f] - root.values[f]) * scale;
      }
    }
    paths.push_back(std::move(path));
  }
  progress.Done();
  return {"bones=" + std::to_string(bones.size()) + ",scale=" + NumberText(scale),
          Count(bones.size(), "bone") + " retargeted into RX, RY and RZ, their offsets from the root scaled by " + NumberText(scale) +
              " to the " + NumberText(kStandardHeight) + " mm figure",
          WritePaths(scene, std::move(paths), 3)};
}

// ---- The pipeline -------------------------------------------------------------------------------
//
// What has run on the take is kept on its active clip, one Text parameter per stage (and subject,
// for the stages of a subject): "Pipeline STAGE" or "Pipeline STAGE SUBJECT", whose value is the
// stage's result and the settings it ran with. A stage runs only when the stages it needs have run.

enum class Stage {
  CalibrateCameras, Reconstruct, LabelROM, CalibrateLabelingSubjects, AutoLabel, FixOcclusion,
  CreateSolvingSetupFromLS, CalibrateSolvingSubjects, Solve, Retarget,
};

struct StagePlan {
  std::string_view name;  // the command's name
  bool perSubject;
  std::vector<Stage> needs;
  int settings;  // the Record it reads, or -1
};

const StagePlan& PlanOf(Stage stage) {
  static const StagePlan plans[] = {
      {"OfflineCalibrateCameras", false, {}, static_cast<int>(Record::CircleFit)},
      {"OfflineReconstruct", false, {Stage::CalibrateCameras}, static_cast<int>(Record::Reconstruct)},
      {"OfflineLabelROM", true, {Stage::Reconstruct}, static_cast<int>(Record::LabelROM)},
      {"OfflineCalibrateLabelingSubjects", true, {Stage::LabelROM}, static_cast<int>(Record::LabelingSubjectCalibration)},
      {"OfflineAutoLabel", true, {Stage::Reconstruct, Stage::CalibrateLabelingSubjects}, static_cast<int>(Record::Labeling)},
      {"OfflineFixOcclusion", true, {}, static_cast<int>(Record::OcclusionFixing)},
      {"OfflineCreateSolvingSetupFromLS", true, {Stage::CalibrateLabelingSubjects}, -1},
      {"OfflineCalibrateSolvingSubjects", true, {Stage::CreateSolvingSetupFromLS}, static_cast<int>(Record::Solving)},
      {"OfflineSolve", true, {Stage::CalibrateSolvingSubjects}, static_cast<int>(Record::Solving)},
      {"OfflineRetarget", true, {Stage::Solve}, -1},
  };
  return plans[static_cast<int>(stage)];
}

std::string StateName(Stage stage, const Object* subject) {
  std::string name = "Pipeline ";
  name.append(PlanOf(stage).name);
  if (subject) name.append(1, ' ').append(subject->name);
  return name;
}

Object& TakeOf(Scene& scene) {
  Object* clip = scene.Find(scene.activeClip);
  if (!clip) Refuse("the pipeline's state is kept on the active clip, and there is none");
  return *clip;
}

// Refuses, naming the stage that must run first, unless every stage `stage` needs has run for every
// subject in `subjects`; and refuses occlusion fixing while its settings turn it off.
void CheckNeeds(Scene& scene, Stage stage, const std::vector<Object*>& subjects) {
  Object& take = TakeOf(scene);
  for (Stage need : PlanOf(stage).needs) {
    const StagePlan& plan = PlanOf(need);
    std::vector<const Object*> scope(subjects.begin(), subjects.end());
    if (!plan.perSubject) scope = {nullptr};
    for (const Object* s : scope)
      if (!take.FindParameter(StateName(need, s))) {
        std::string why(1, '\'');
        why.append(PlanOf(stage).name).append("' needs '").append(plan.name).append("' to run first");
        if (s) why.append(" for subject '").append(s->name).append(1, '\'');
        Refuse(why);
      }
  }
  if (stage == Stage::FixOcclusion && !scene.settings.Flag(Record::OcclusionFixing, "Enabled"))
    Refuse("occlusion fixing is off (OcclusionFixing setting 'Enabled')");
}

std::size_t SeenFrames(const Track& t, std::size_t frames) {
  std::size_t seen = 0;
  for (std::size_t f = 0; f < frames; ++f) seen += t.Seen(f);
  return seen;
}

// Works out one stage for one subject (null for the take-wide stages), its needs already checked.
Outcome Compute(Context& context, Stage stage, Object* subject) {
  Scene& scene = context.scene;
  std::string what(PlanOf(stage).name);
  if (subject) what += " " + Quoted(*subject);
  Progress progress(context, what, static_cast<std::size_t>(scene.frames));
  switch (stage) {
    case Stage::CalibrateCameras: {
      std::size_t cameras = scene.OfType(scene.Root(), "Camera").size();
      if (cameras < 2) Refuse("'OfflineCalibrateCameras' needs at least two cameras in the scene, and there are " + std::to_string(cameras));
      return {"cameras=" + std::to_string(cameras), Count(cameras, "camera") + " counted; the take has no camera data, so nothing was calibrated",
              nullptr};
    }
    case Stage::Reconstruct: {
      std::size_t markers = 0, seen = 0;
      for (Object* s : scene.OfType(scene.Root(), "Subject"))
        for (const Track& t : TracksOf(scene, *s)) ++markers, seen += SeenFrames(t, static_cast<std::size_t>(scene.frames));
      return {"trajectories=" + std::to_string(markers) + ",seen=" + std::to_string(seen),
              Count(markers, "trajectory", "trajectories") + " counted, seen at " + Count(seen, "frame") +
                  " in all; the take has no camera data, so nothing was reconstructed",
              nullptr};
    }
    case Stage::LabelROM: return LabelROM(scene, *subject, progress);
    case Stage::CalibrateLabelingSubjects: return CalibrateLabelingSubjects(scene, *subject, progress);
    case Stage::AutoLabel: return AutoLabel(scene, *subject, progress);
    case Stage::FixOcclusion: {
      Progress markers(context, what, scene.OfType(*subject, "Marker").size());
      return FixOcclusion(scene, *subject, markers);
    }
    case Stage::CreateSolvingSetupFromLS: return CreateSolvingSetup(scene, *subject);
    case Stage::CalibrateSolvingSubjects: return CalibrateSolvingSubjects(scene, *subject, progress);
    case Stage::Solve: return Solve(scene, *subject, progress);
    case Stage::Retarget: {
      Progress bones(context, what, scene.Bones(*subject).size());
      return Retarget(scene, *subject, bones);
    }
  }
  return {};
}

// Runs one stage over its subjects: every subject's outcome is worked out while other clients may
// read, then all are written and recorded at once, so that a refusal for one subject changes nothing.
// Returns what it did: the take-wide stage's summary, or one "SUBJECT: summary" per subject.
std::vector<std::string> RunStage(Context& context, Stage stage, const std::vector<Object*>& subjects) {
  CheckNeeds(context.scene, stage, subjects);
  std::vector<Object*> scope(subjects.begin(), subjects.end());
  if (!PlanOf(stage).perSubject) scope = {nullptr};
  std::vector<Outcome> outcomes;
  for (Object* s : scope) outcomes.push_back(Compute(context, stage, s));
  Exclusively(context, [&] {
    Scene& scene = context.scene;
    const StagePlan& plan = PlanOf(stage);
    for (std::size_t i = 0; i < scope.size(); ++i) {
      if (outcomes[i].write) outcomes[i].write();
      std::string result = outcomes[i].result;
      if (plan.settings >= 0) result.append(1, ';').append(scene.settings.Summary(static_cast<Record>(plan.settings)));
      std::string name = StateName(stage, scope[i]);
      SetText(TakeOf(scene), name, result);
      LogLine("info", name + ": " + result);
    }
  });
  std::vector<std::string> done;
  for (std::size_t i = 0; i < scope.size(); ++i) done.push_back(scope[i] ? scope[i]->name + ": " + outcomes[i].summary : outcomes[i].summary);
  return done;
}

std::string Joined(const std::vector<std::string>& parts) {
  std::string text;
  for (const std::string& part : parts) text.append(text.empty() ? "" : "; ").append(part);
  return text;
}

// The handlers of the stages: the inputs are read in the catalogue's order (an Options string is
// refused unless empty), every need is checked, then the stage runs.
template <Stage S, bool Subject, bool Options>
void Run(Context& context, Reader& in, Writer&) {
  std::string_view name = Subject ? in.Text() : std::string_view();
  if constexpr (Options) NoOptions(PlanOf(S).name, in.Text());
  context.summary = Joined(RunStage(context, S, PlanOf(S).perSubject ? SubjectsOf(context.scene, name) : std::vector<Object*>()));
}

// The quick post-processing run: labelling, occlusion fixing and solving, in that order, stopping at
// the first stage that cannot run (the stages before it keep their results). Its summary is each
// stage's, as "STAGE SUBJECT: summary".
constexpr Stage kQuickPost[] = {Stage::AutoLabel, Stage::FixOcclusion, Stage::Solve};

void OfflineQuickPost(Context& context, Reader& in, Writer&) {
  std::string_view name = in.Text();
  NoOptions("OfflineQuickPost", in.Text());
  std::vector<Object*> subjects = SubjectsOf(context.scene, name);
  std::vector<std::string> done;
  for (Stage stage : kQuickPost) {
    try {
      for (const std::string& part : RunStage(context, stage, subjects)) done.push_back(std::string(PlanOf(stage).name) + " " + part);
    } catch (const Failure& failure) {
      Refuse("quick post stopped at '" + std::string(PlanOf(stage).name) + "': " + failure.message);
    }
  }
  context.summary = Joined(done);
}

constexpr HandlerEntry kHandlers[] = {
    {Id::OfflineCalibrateCameras, &Run<Stage::CalibrateCameras, false, true>, Access::Stage},
    {Id::OfflineReconstruct, &Run<Stage::Reconstruct, false, true>, Access::Stage},
    {Id::OfflineLabelROM, &Run<Stage::LabelROM, true, true>, Access::Stage},
    {Id::OfflineCalibrateLabelingSubjects, &Run<Stage::CalibrateLabelingSubjects, true, true>, Access::Stage},
    {Id::OfflineAutoLabel, &Run<Stage::AutoLabel, true, true>, Access::Stage},
    {Id::OfflineFixOcclusion, &Run<Stage::FixOcclusion, true, true>, Access::Stage},
    {Id::OfflineCreateSolvingSetupFromLS, &Run<Stage::CreateSolvingSetupFromLS, true, false>, Access::Stage},
    {Id::OfflineCalibrateSolvingSubjects, &Run<Stage::CalibrateSolvingSubjects, true, true>, Access::Stage},
    {Id::OfflineSolve, &Run<Stage::Solve, true, false>, Access::Stage},
    {Id::OfflineRetarget, &Run<Stage::Retarget, true, false>, Access::Stage},
    {Id::OfflineQuickPost, &OfflineQuickPost, Access::Stage},
};

}  // namespace

std::span<const HandlerEntry> ProcessingHandlers() { return kHandlers; }

}  // namespace client3::host
