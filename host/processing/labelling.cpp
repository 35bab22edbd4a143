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
  std::vector<std::string> parts = SplitList(p->value);
  double v[4];
  for (std::size_t i = 0; i < 4; ++i) {
    std::optional<double> number = i < parts.size() ? ParseDouble(parts[i]) : std::nullopt;
    if (!number) return std::nullopt;
    v[i] = *number;
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

// The per-axis median of `points` (at least one).
Point Median(const std::vector<Point>& points) {
  Point median;
  std::vector<double> axis(points.size());
  for (std::size_t a = 0; a < 3; ++a) {
    for (std::size_t i = 0; i < points.size(); ++i) axis[i] = points[i][a];
    std::nth_element(axis.begin(), axis.begin() + static_cast<std::ptrdiff_t>(axis.size() / 2), axis.end());
    median[a] = axis[axis.size() / 2];
  }
  return median;
}

// Labels a subject's frames one after another (see AutoLabel). The markers that receive points are
// those of the labels, in the labels' order, then the unlabelled ones.
class Labeller {
 public:
  Labeller(std::vector<Track> markers, std::vector<Label> labels, std::size_t frames)
      : markers_(std::move(markers)), labels_(std::move(labels)), results_(markers_.size()) {
    for (std::size_t i = 0; i < markers_.size(); ++i) {
      for (int a = 0; a < 3; ++a) results_[i].values[a] = markers_[i].axes[a]->values;
      results_[i].seen.assign(frames, false);
    }
    std::vector<Point> offsets;
    for (const Label& l : labels_) offsets.push_back(l.offset);
    middle_ = Median(offsets);
  }

  // Labels frame `f`.
  void Frame(std::size_t f) {
    points_.clear(), from_.clear();
    for (std::size_t i = 0; i < markers_.size(); ++i)
      if (markers_[i].Seen(f)) points_.push_back(markers_[i].At(f)), from_.push_back(i);
    if (points_.empty()) return last_.reset();
    last_ = Place(last_ ? *last_ : Median(points_) - middle_);
    Give(f);
  }

  // The new trajectories, with what was done: the labels given, those given a point that another
  // marker held, and the points dropped.
  Outcome Finish() {
    std::string result = "labelled=" + std::to_string(assigned_) + ",moved=" + std::to_string(moved_) + ",dropped=" + std::to_string(dropped_);
    std::string summary = Count(assigned_, "label") + " given, " + std::to_string(moved_) + " of them to a point another marker held; " +
                          Count(dropped_, "point") + " dropped";
    return {result, summary, [markers = markers_, results = std::move(results_)] {
              for (std::size_t i = 0; i < markers.size(); ++i)
                for (int a = 0; a < 3; ++a) {
                  Channel& c = *markers[i].axes[a];
                  c.values = results[i].values[a];
                  for (std::size_t f = 0; f < c.keys.size(); ++f)
                    if (results[i].seen[f]) c.keys[f] = true;
                    else c.DeleteKey(f);
                }
            }};
  }

 private:
  // Where the pairs of the last assignment put the template, one place per label that took a point.
  std::vector<Point> Places() const {
    std::vector<Point> places;
    for (std::size_t l = 0; l < labels_.size(); ++l)
      if (int p = assignment_.taken[l]; p >= 0) places.push_back(points_[static_cast<std::size_t>(p)] - labels_[l].offset);
    return places;
  }

  // The three passes from `start`: pairing regardless of reach, then within reach at the median and
  // at the mean of where the pairs before put the template. Returns where it was placed last.
  Point Place(const Point& start) {
    assignment_.Assign(labels_, start, true, points_);
    Point centre = Median(Places());
    assignment_.Assign(labels_, centre, false, points_);
    std::vector<Point> places = Places();
    if (places.empty()) return centre;
    Point sum{};
    for (const Point& p : places) sum = sum + p;
    centre = sum * (1.0 / static_cast<double>(places.size()));
    assignment_.Assign(labels_, centre, false, points_);
    return centre;
  }

  // Each label's marker takes the label's point; the points no label took go to the unlabelled
  // markers in order, and those left over are dropped.
  void Give(std::size_t f) {
    used_.assign(points_.size(), false);
    auto put = [&](std::size_t marker, std::size_t point) {
      for (int a = 0; a < 3; ++a) results_[marker].values[a][f] = points_[point][static_cast<std::size_t>(a)];
      results_[marker].seen[f] = true;
      used_[point] = true;
    };
    for (std::size_t l = 0; l < labels_.size(); ++l)
      if (int p = assignment_.taken[l]; p >= 0) put(l, static_cast<std::size_t>(p)), ++assigned_, moved_ += from_[static_cast<std::size_t>(p)] != l;
    std::size_t next = labels_.size();
    for (std::size_t p = 0; p < points_.size(); ++p) {
      if (used_[p]) continue;
      if (next < markers_.size()) put(next++, p);
      else ++dropped_;
    }
  }

  // A marker's new trajectory, from its old one: a frame that loses its point keeps its values.
  struct Trajectory {
    std::vector<double> values[3];
    std::vector<bool> seen;
  };

  std::vector<Track> markers_;
  std::vector<Label> labels_;
  std::vector<Trajectory> results_;
  Point middle_;              // the median of the labels' offsets
  std::optional<Point> last_;  // where the template was placed at the frame before
  std::vector<Point> points_;  // the frame's points ...
  std::vector<std::size_t> from_;  // ... and the markers they came from
  Assignment assignment_;
  std::vector<bool> used_;
  std::size_t assigned_ = 0, moved_ = 0, dropped_ = 0;
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
// it, now within reach; and at the mean of where the second pass's pairs put it. A label without a
// point in reach leaves its marker unseen at that frame. The points no label takes go to the
// unlabelled markers, in order; those that find no unlabelled marker are dropped.
Outcome AutoLabel(Scene& scene, Object& subject, Progress& progress) {
  std::vector<Track> markers, unlabelled;
  std::vector<Label> labels;
  for (const Track& t : TracksOf(scene, subject)) {
    if (std::optional<Label> label = LabelOf(*t.marker)) labels.push_back(*label), markers.push_back(t);
    else unlabelled.push_back(t);
  }
  if (labels.empty()) Refuse(Quoted(subject) + " has no label template: 'OfflineLabelROM' must run first");
  markers.insert(markers.end(), unlabelled.begin(), unlabelled.end());
  auto frames = static_cast<std::size_t>(scene.frames);
  Labeller labeller(std::move(markers), std::move(labels), frames);
  for (std::size_t f = 0; f < frames; ++f) {
    progress.At(f);
    labeller.Frame(f);
  }
  progress.Done();
  return labeller.Finish();
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
