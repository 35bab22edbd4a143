// Occlusion fixing: the gaps of the markers' trajectories filled from a marker of the same segment,
// or by cubic interpolation.
#include <cmath>
#include <memory>

#include "host/commands/lookups.h"
#include "host/processing/stage.h"

namespace client3::host {

namespace {

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

// Cubic Hermite interpolation between the frames beside the gap, b and a, with the slopes of the
// data there: at b, (3 x[b] - 4 x[b-1] + x[b-2]) / 2 where b-1 and b-2 are seen, x[b] - x[b-1]
// where only b-1 is, else the straight line's (x[a] - x[b]) / (a - b); at a likewise, forwards.
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

}  // namespace

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
    for (auto [first, end] : Runs(frames, [&](std::size_t f) { return !t.Seen(f); })) {
      if (first == 0 || end == frames || static_cast<double>(end - first) > longest) {
        ++(first == 0 || end == frames ? ends : longer);
        continue;
      }
      Fill fill{&t, first, end, {}};
      if (FromNeighbour(*tracks, fill)) ++rigid;
      else Cubic(fill, frames);
      fills.push_back(std::move(fill));
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

}  // namespace client3::host
