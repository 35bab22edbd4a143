// The offline processing stages that work on the take's trajectories.
#include <cmath>

#include "host/handlers.h"

namespace client3::host {

using protocol::Id;
using protocol::Reader;
using protocol::Writer;

namespace {

struct Track {
  Object* marker;
  std::string bone;  // the bone the marker's constraint ties it to; empty when none does
  Channel* axes[3];
  bool Seen(std::size_t f) const { return axes[0]->keys[f] && axes[1]->keys[f] && axes[2]->keys[f]; }
};

std::vector<Track> TracksOf(Scene& scene, Object& subject) {
  std::vector<Track> tracks;
  for (Object* m : scene.OfType(subject, "Marker")) {
    Channel *x = m->FindChannel("X"), *y = m->FindChannel("Y"), *z = m->FindChannel("Z");
    if (!x || !y || !z) continue;
    Track t{m, {}, {x, y, z}};
    for (Object* c : scene.OfType(subject, "Constraint"))
      if (c->Text("Source") == m->name) t.bone = c->Text("Target");
    tracks.push_back(t);
  }
  return tracks;
}

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

std::string FixOcclusion(Scene& scene, const std::vector<Object*>& subjects) {
  const Settings& settings = scene.settings;
  double longest = std::floor(settings.Number(Record::OcclusionFixing, "TransitionTime") * scene.timeline.rate + 1e-9);
  bool apply = settings.Flag(Record::OcclusionFixing, "ApplyFixedMarkers");
  auto frames = static_cast<std::size_t>(scene.frames);
  std::size_t filled = 0, rigid = 0, left = 0;
  for (Object* subject : subjects) {
    std::vector<Track> tracks = TracksOf(scene, *subject);
    // Every fill is worked out from the data as it was, then written.
    std::vector<Fill> fills;
    for (const Track& t : tracks) {
      for (std::size_t f = 0; f < frames;) {
        if (t.Seen(f)) {
          ++f;
          continue;
        }
        std::size_t end = f;
        while (end < frames && !t.Seen(end)) ++end;
        if (f == 0 || end == frames || static_cast<double>(end - f) > longest) {
          ++left, f = end;
          continue;
        }
        Fill fill{&t, f, end, {}};
        if (FromNeighbour(tracks, fill)) ++rigid;
        else Cubic(fill, frames);
        fills.push_back(std::move(fill));
        f = end;
      }
    }
    for (const Fill& fill : fills) {
      for (int a = 0; a < 3; ++a) {
        Channel& c = *fill.track->axes[a];
        for (std::size_t f = fill.first; f < fill.end; ++f) {
          if (apply) c.SetKey(f, fill.values[a][f - fill.first]);
          else c.values[f] = fill.values[a][f - fill.first];
        }
      }
    }
    filled += fills.size();
  }
  return "filled=" + std::to_string(filled) + ",rigid=" + std::to_string(rigid) + ",left=" + std::to_string(left);
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
// subject in `subjects`.
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
}

void Remember(Scene& scene, Stage stage, const Object* subject, std::string result) {
  const StagePlan& plan = PlanOf(stage);
  if (plan.settings >= 0) result.append(1, ';').append(scene.settings.Summary(static_cast<Record>(plan.settings)));
  Object& take = TakeOf(scene);
  std::string name = StateName(stage, subject);
  Parameter* p = take.FindParameter(name);
  if (!p) take.parameters.push_back({NewId(), name, ParameterKind::Text, "", "", "", false}), p = &take.parameters.back();
  p->value = result;
  LogLine("info", name + ": " + result);
}

std::size_t SeenFrames(const Track& t, std::size_t frames) {
  std::size_t seen = 0;
  for (std::size_t f = 0; f < frames; ++f) seen += t.Seen(f);
  return seen;
}

// Runs one stage, its needs already checked. Returns nothing; its results are in the take's state.
void RunStage(Scene& scene, Stage stage, const std::vector<Object*>& subjects) {
  auto frames = static_cast<std::size_t>(scene.frames);
  switch (stage) {
    case Stage::CalibrateCameras: {
      std::size_t cameras = scene.OfType(scene.Root(), "Camera").size();
      if (cameras < 2) Refuse("'OfflineCalibrateCameras' needs at least two cameras in the scene, and there are " + std::to_string(cameras));
      Remember(scene, stage, nullptr, "cameras=" + std::to_string(cameras));
      return;
    }
    case Stage::Reconstruct: {
      std::size_t markers = 0, seen = 0;
      for (Object* s : scene.OfType(scene.Root(), "Subject"))
        for (const Track& t : TracksOf(scene, *s)) ++markers, seen += SeenFrames(t, frames);
      Remember(scene, stage, nullptr, "trajectories=" + std::to_string(markers) + ",seen=" + std::to_string(seen));
      return;
    }
    case Stage::FixOcclusion: {
      for (Object* s : subjects) Remember(scene, stage, s, FixOcclusion(scene, {s}));
      return;
    }
    default: break;
  }
  for (Object* s : subjects) {
    std::vector<Track> tracks = TracksOf(scene, *s);
    std::string result;
    switch (stage) {
      case Stage::LabelROM:
      case Stage::CalibrateLabelingSubjects:
      case Stage::AutoLabel: {
        std::size_t seen = 0;
        for (const Track& t : tracks) seen += SeenFrames(t, frames) > 0;
        result = "markers=" + std::to_string(tracks.size()) + ",labelled=" + std::to_string(seen);
        break;
      }
      case Stage::CreateSolvingSetupFromLS:
      case Stage::CalibrateSolvingSubjects: {
        std::size_t tied = 0;
        for (const Track& t : tracks) tied += !t.bone.empty();
        result = "bones=" + std::to_string(scene.Bones(*s).size()) + ",constraints=" + std::to_string(tied);
        break;
      }
      default: {  // solving and retargeting: the frames where every marker is seen
        std::size_t whole = 0;
        for (std::size_t f = 0; f < frames; ++f) {
          bool all = true;
          for (const Track& t : tracks) all = all && t.Seen(f);
          whole += all;
        }
        result = "frames=" + std::to_string(whole);
        break;
      }
    }
    Remember(scene, stage, s, result);
  }
}

// The handlers of the stages: the inputs are read in the catalogue's order (an Options string is
// refused unless empty), every need is checked, then the stage runs.
template <Stage S, bool Subject, bool Options>
void Run(Context& context, Reader& in, Writer&) {
  Scene& scene = context.scene;
  std::string_view name = Subject ? in.Text() : std::string_view();
  if constexpr (Options) NoOptions(PlanOf(S).name, in.Text());
  std::vector<Object*> subjects = PlanOf(S).perSubject ? SubjectsOf(scene, name) : std::vector<Object*>();
  CheckNeeds(scene, S, subjects);
  if (S == Stage::FixOcclusion && !scene.settings.Flag(Record::OcclusionFixing, "Enabled"))
    Refuse("occlusion fixing is off (OcclusionFixing setting 'Enabled')");
  RunStage(scene, S, subjects);
}

// The quick post-processing run: labelling, occlusion fixing and solving, in that order, stopping at
// the first stage that cannot run (the stages before it keep their results).
constexpr Stage kQuickPost[] = {Stage::AutoLabel, Stage::FixOcclusion, Stage::Solve};

void OfflineQuickPost(Context& context, Reader& in, Writer&) {
  Scene& scene = context.scene;
  std::string_view name = in.Text();
  NoOptions("OfflineQuickPost", in.Text());
  std::vector<Object*> subjects = SubjectsOf(scene, name);
  for (Stage stage : kQuickPost) {
    try {
      CheckNeeds(scene, stage, subjects);
      if (stage == Stage::FixOcclusion && !scene.settings.Flag(Record::OcclusionFixing, "Enabled"))
        Refuse("occlusion fixing is off (OcclusionFixing setting 'Enabled')");
      RunStage(scene, stage, subjects);
    } catch (const Failure& failure) {
      Refuse("quick post stopped at '" + std::string(PlanOf(stage).name) + "': " + failure.message);
    }
  }
}

constexpr HandlerEntry kHandlers[] = {
    {Id::OfflineCalibrateCameras, &Run<Stage::CalibrateCameras, false, true>},
    {Id::OfflineReconstruct, &Run<Stage::Reconstruct, false, true>},
    {Id::OfflineLabelROM, &Run<Stage::LabelROM, true, true>},
    {Id::OfflineCalibrateLabelingSubjects, &Run<Stage::CalibrateLabelingSubjects, true, true>},
    {Id::OfflineAutoLabel, &Run<Stage::AutoLabel, true, true>},
    {Id::OfflineFixOcclusion, &Run<Stage::FixOcclusion, true, true>},
    {Id::OfflineCreateSolvingSetupFromLS, &Run<Stage::CreateSolvingSetupFromLS, true, false>},
    {Id::OfflineCalibrateSolvingSubjects, &Run<Stage::CalibrateSolvingSubjects, true, true>},
    {Id::OfflineSolve, &Run<Stage::Solve, true, false>},
    {Id::OfflineRetarget, &Run<Stage::Retarget, true, false>},
    {Id::OfflineQuickPost, &OfflineQuickPost},
};

}  // namespace

std::span<const HandlerEntry> ProcessingHandlers() { return kHandlers; }

}  // namespace client3::host
