// The solving stages: the solving setup, the bones' translations, the bones' paths from the
// markers, and the solved motion retargeted onto the standard figure.
#include <algorithm>
#include <optional>

#include "host/commands/lookups.h"
#include "host/processing/stage.h"

namespace client3::host {

namespace {

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

constexpr double kStandardHeight = 1750;  // the standard figure's height, in millimetres

}  // namespace

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

}  // namespace client3::host
