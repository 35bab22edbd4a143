#include "host/processing/pipeline.h"

#include <algorithm>

#include "host/commands/lookups.h"
#include "host/processing/stage.h"
#include "host/server/log.h"

namespace client3::host {

namespace {

struct StagePlan {
  protocol::Id command;  // the command that runs it
  std::vector<Stage> needs;
  int settings;  // the Record it reads, or -1

  std::string_view name() const { return protocol::CommandOf(command).name; }
  // Whether it works on subjects: its command names one.
  bool perSubject() const {
    auto inputs = protocol::CommandOf(command).in;
    return std::any_of(inputs.begin(), inputs.end(), [](const protocol::Param& p) { return p.name == "Subject"; });
  }
};

const StagePlan& PlanOf(Stage stage) {
  using protocol::Id;
  static const StagePlan plans[] = {
      {Id::OfflineCalibrateCameras, {}, static_cast<int>(Record::CircleFit)},
      {Id::OfflineReconstruct, {Stage::CalibrateCameras}, static_cast<int>(Record::Reconstruct)},
      {Id::OfflineLabelROM, {Stage::Reconstruct}, static_cast<int>(Record::LabelROM)},
      {Id::OfflineCalibrateLabelingSubjects, {Stage::LabelROM}, static_cast<int>(Record::LabelingSubjectCalibration)},
      {Id::OfflineAutoLabel, {Stage::Reconstruct, Stage::CalibrateLabelingSubjects}, static_cast<int>(Record::Labeling)},
      {Id::OfflineFixOcclusion, {}, static_cast<int>(Record::OcclusionFixing)},
      {Id::OfflineCreateSolvingSetupFromLS, {Stage::CalibrateLabelingSubjects}, -1},
      {Id::OfflineCalibrateSolvingSubjects, {Stage::CreateSolvingSetupFromLS}, static_cast<int>(Record::Solving)},
      {Id::OfflineSolve, {Stage::CalibrateSolvingSubjects}, static_cast<int>(Record::Solving)},
      {Id::OfflineRetarget, {Stage::Solve}, -1},
  };
  return plans[static_cast<int>(stage)];
}

std::string StateName(Stage stage, const Object* subject) {
  std::string name = "Pipeline ";
  name.append(PlanOf(stage).name());
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
    if (!plan.perSubject()) scope = {nullptr};
    for (const Object* s : scope)
      if (!take.FindParameter(StateName(need, s))) {
        std::string why(1, '\'');
        why.append(PlanOf(stage).name()).append("' needs '").append(plan.name()).append("' to run first");
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
  std::string what(PlanOf(stage).name());
  if (subject) what.append(1, ' ').append(Quoted(*subject));
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

}  // namespace

const protocol::Command& StageCommand(Stage stage) { return protocol::CommandOf(PlanOf(stage).command); }

std::vector<std::string> RunStage(Context& context, Stage stage, const std::vector<Object*>& subjects) {
  CheckNeeds(context.scene, stage, subjects);
  std::vector<Object*> scope(subjects.begin(), subjects.end());
  if (!PlanOf(stage).perSubject()) scope = {nullptr};
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

}  // namespace client3::host
