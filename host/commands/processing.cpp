// The handlers of the processing stages and of the quick post-processing run.
#include <optional>

#include "host/commands/command.h"
#include "host/commands/lookups.h"
#include "host/processing/pipeline.h"

namespace client3::host {

namespace {

// The subjects a stage works on: the one named, or every subject for an empty name.
std::vector<Object*> SubjectsOf(Scene& scene, std::string_view name) {
  if (name.empty()) return scene.OfType(scene.Root(), "Subject");
  return {&SubjectOf(scene, name)};
}

std::string Joined(const std::vector<std::string>& parts) {
  std::string text;
  for (const std::string& part : parts) text.append(text.empty() ? "" : "; ").append(part);
  return text;
}

// A stage's inputs in the catalogue's order: the subject where its command has one, and options,
// refused unless empty. Every need is checked, then the stage runs.
void RunStageCommand(Context& context, protocol::Reader& in, Stage stage) {
  const protocol::Command& command = StageCommand(stage);
  std::optional<std::string_view> subject;
  for (const protocol::Param& input : command.in) {
    if (input.name == "Subject") subject = in.Text();
    else NoOptions(command.name, in.Text());
  }
  context.summary = Joined(RunStage(context, stage, subject ? SubjectsOf(context.scene, *subject) : std::vector<Object*>()));
}

// The quick post-processing run: labelling, occlusion fixing and solving, in that order.
constexpr Stage kQuickPost[] = {Stage::AutoLabel, Stage::FixOcclusion, Stage::Solve};

}  // namespace

CLIENT3_HANDLER(OfflineCalibrateCameras, Stage) { RunStageCommand(context, in, Stage::CalibrateCameras); }
CLIENT3_HANDLER(OfflineReconstruct, Stage) { RunStageCommand(context, in, Stage::Reconstruct); }
CLIENT3_HANDLER(OfflineLabelROM, Stage) { RunStageCommand(context, in, Stage::LabelROM); }
CLIENT3_HANDLER(OfflineCalibrateLabelingSubjects, Stage) { RunStageCommand(context, in, Stage::CalibrateLabelingSubjects); }
CLIENT3_HANDLER(OfflineAutoLabel, Stage) { RunStageCommand(context, in, Stage::AutoLabel); }
CLIENT3_HANDLER(OfflineFixOcclusion, Stage) { RunStageCommand(context, in, Stage::FixOcclusion); }
CLIENT3_HANDLER(OfflineCreateSolvingSetupFromLS, Stage) { RunStageCommand(context, in, Stage::CreateSolvingSetupFromLS); }
CLIENT3_HANDLER(OfflineCalibrateSolvingSubjects, Stage) { RunStageCommand(context, in, Stage::CalibrateSolvingSubjects); }
CLIENT3_HANDLER(OfflineSolve, Stage) { RunStageCommand(context, in, Stage::Solve); }
CLIENT3_HANDLER(OfflineRetarget, Stage) { RunStageCommand(context, in, Stage::Retarget); }

// Stops at the first stage that cannot run (the stages before it keep their results). Its summary
// is each stage's, as "STAGE SUBJECT: summary".
CLIENT3_HANDLER(OfflineQuickPost, Stage) {
  std::string_view name = in.Text();
  NoOptions("OfflineQuickPost", in.Text());
  std::vector<Object*> subjects = SubjectsOf(context.scene, name);
  std::vector<std::string> done;
  for (Stage stage : kQuickPost) {
    std::string stageName(StageCommand(stage).name);
    try {
      for (const std::string& part : RunStage(context, stage, subjects)) done.push_back(stageName + " " + part);
    } catch (const Failure& failure) {
      Refuse("quick post stopped at '" + stageName + "': " + failure.message);
    }
  }
  context.summary = Joined(done);
}

}  // namespace client3::host
