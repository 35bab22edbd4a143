// The labelling stages: the label template from a range of motion, the offsets of the labelling
// subject's constraints, and labelling every frame's points.
#include <algorithm>
#include <cmath>
#include <optional>

#include "host/commands/lookups.h"
#include "host/processing/stage.h"

namespace client3::host {

namespace {

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

}  // namespace

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

}  // namespace client3::host
