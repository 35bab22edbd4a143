// The processing pipeline: its stages, what each needs to have run first, and running a stage.
//
// What has run on the take is kept on its active clip, one Text parameter per stage (and subject,
// for the stages of a subject): "Pipeline STAGE" or "Pipeline STAGE SUBJECT", whose value is the
// stage's result and the settings it ran with. A stage runs only when the stages it needs have run.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "host/commands/command.h"

namespace client3::host {

enum class Stage {
  CalibrateCameras, Reconstruct, LabelROM, CalibrateLabelingSubjects, AutoLabel, FixOcclusion,
  CreateSolvingSetupFromLS, CalibrateSolvingSubjects, Solve, Retarget,
};

// The command that runs the stage, as the catalogue declares it.
const protocol::Command& StageCommand(Stage stage);

// Runs one stage over `subjects` (a take-wide stage runs once, whatever they are): every subject's
// outcome is worked out while other clients may read, then all are written and recorded at once,
// so that a refusal for one subject changes nothing. Returns what it did: the take-wide stage's
// summary, or one "SUBJECT: summary" per subject.
std::vector<std::string> RunStage(Context& context, Stage stage, const std::vector<Object*>& subjects);

}  // namespace client3::host
