// The application's commands, declared once. Each line gives a command's name, what it does, its
// inputs and its outputs, each a named and typed parameter. The library encodes its requests from
// these lines, the host decodes and answers them, and the command list, the command descriptions
// and the generic request by name are read from them.
#pragma once

#include <array>
#include <cstdint>
#include <span>
#include <string_view>

namespace client3::protocol {

// The types of values on the wire; each value travels behind its type's tag.
enum class Type : std::uint8_t {
  String = 1,  // UTF-8 text
  Int,         // signed 32 bits
  UInt,        // unsigned 32 bits
  ULong,       // unsigned 64 bits
  Bool,
  Float,
  Double,
  Strings,  // the arrays: a count, then the elements
  Bools,
  Floats,
  Doubles,
  Ints,
  ULongs,
  Params,  // name and value text pairs
};

struct Param {
  std::string_view name;
  Type type;
  std::string_view fallback;  // the value an omitted input of a generic request takes, as text
};

constexpr std::string_view DefaultText(Type type) {
  switch (type) {
    case Type::Int: case Type::UInt: case Type::ULong: case Type::Float: case Type::Double: return "0";
    case Type::Bool: return "false";
    default: return "";
  }
}
constexpr Param P(std::string_view name, Type type) { return {name, type, DefaultText(type)}; }
constexpr Param P(std::string_view name, Type type, std::string_view fallback) { return {name, type, fallback}; }

template <class... T>
constexpr std::array<Param, sizeof...(T)> List(T... params) {
  return {params...};
}

struct Command {
  std::string_view name;
  std::string_view description;
  std::span<const Param> in;
  std::span<const Param> out;
};

// The fields of the settings records, read by one command and written by another.
#define CLIENT3_CIRCLE_FIT_SETTINGS \
  P("Enabled", Bool), \
  P("NumThreads", Int), \
  P("EnableVideoCentroids", Bool)
#define CLIENT3_RECONSTRUCT_SETTINGS \
  P("EnvironmentalDriftTolerance", Double), \
  P("MinCamsToStartTrajectory", UInt), \
  P("MinCamsToContinueTrajectory", UInt), \
  P("ReconMinSeparation", Double), \
  P("MinCentroidRadius", Double), \
  P("MaxCentroidRadius", Double), \
  P("MinReconstructionRadius", Double), \
  P("MaxReconstructionRadius", Double), \
  P("FitMethod", String), \
  P("PredicationMatchFactor", Double), \
  P("MinTrajectoryLength", UInt), \
  P("StartupError", Double), \
  P("PredicationError", Double), \
  P("ComputeRadius", Bool), \
  P("MinVolumeX", Double), \
  P("MinVolumeY", Double), \
  P("MinVolumeZ", Double), \
  P("MaxVolumeX", Double), \
  P("MaxVolumeY", Double), \
  P("MaxVolumeZ", Double), \
  P("NumThreads", Int)
#define CLIENT3_LABEL_ROM_SETTINGS \
  P("StandardDeviation", Float), \
  P("SeparationDistance", Float)
#define CLIENT3_LABELING_SETTINGS \
  P("UseLabelingClusters", Bool), \
  P("LabelCompletenessEntranceThreshold", Double), \
  P("UseRobustBooting", Bool), \
  P("BootingQuality", Double), \
  P("BootingVersusTracking", Double), \
  P("TrackingQuality", Double), \
  P("SmoothingFactor", Double), \
  P("SinglePassLabel", Bool), \
  P("NumThreads", Int)
#define CLIENT3_LABELING_SUBJECT_CALIBRATION_SETTINGS \
  P("RestImportance", Float), \
  P("MarkerImportance", Float), \
  P("SegmentImportance", Float), \
  P("Quality", String), \
  P("StatsMode", String), \
  P("CalibrationMode", String), \
  P("ActiveFrames", Int), \
  P("AutoSaveZSK", Bool), \
  P("AutoSavePreCalHDF", Bool), \
  P("OverwriteRangeTemplates", Bool), \
  P("ShowCovariance", Bool)
#define CLIENT3_OCCLUSION_FIXING_SETTINGS \
  P("Enabled", Bool), \
  P("ApplyFixedMarkers", Bool), \
  P("MarkerSmoothing", Double), \
  P("DataFidelity", Double), \
  P("TransitionTime", Double)
#define CLIENT3_SOLVING_SETTINGS \
  P("PriorImportance", Double), \
  P("MeanPoseRatio", Double), \
  P("NumThreads", Int), \
  P("ExtrapolateFingers", Bool), \
  P("FingerMultiplier", Double)

// X(name, description, (inputs), (outputs))
#define CLIENT3_COMMANDS(X) \
  X(GetServerInfo, "The application's name, version and release type.", (), (P("Program", String), P("MajorVersion", UInt), P("MinorVersion", UInt), P("PointVersion", UInt), P("ReleaseType", String))) \
  X(GetCommandList, "The names of every command the application answers.", (), (P("Commands", Strings))) \
  X(GetCommandInfo, "A command's description and its input and output parameters with their defaults.", (P("Command", String)), (P("Name", String), P("Description", String), P("InputParameters", Params), P("OutputParameters", Params))) \
  X(ProcessRequest, "Runs a command by name with its parameters given as text.", (P("Command", String), P("Parameters", Params)), (P("Parameters", Params), P("OutputParameters", Params))) \
  X(GetFrameCount, "The number of frames in the take.", (), (P("Count", UInt))) \
  X(SetLanguage, "Sets the language of the application's messages.", (P("Language", String)), ()) \
  X(PSL, "Runs one command written as text: its name followed by Name=Value pairs.", (P("Text", String)), (P("Str", String))) \
  X(Log, "Writes a message to the application's log at the given level.", (P("Level", String), P("Message", String)), ()) \
  X(GetSceneName, "The scene's name and the path of the file it was loaded from or saved to.", (), (P("Name", String), P("Path", String))) \
  X(SetSceneName, "Renames the scene.", (P("Name", String)), ()) \
  X(GetSubjectNames, "The subjects in the scene with their models and whether each is active.", (), (P("Names", Strings), P("Models", Strings), P("Active", Bools))) \
  X(GetMarkerNames, "The names of a subject's markers.", (P("Subject", String)), (P("Names", Strings))) \
  X(GetBoneNames, "The names of the bones of a subject's skeleton.", (P("Subject", String), P("Skeleton", String)), (P("Names", Strings))) \
  X(GetRootBone, "The root bone of a subject's skeleton.", (P("Subject", String), P("Skeleton", String)), (P("Name", String))) \
  X(GetBoneDetails, "A bone's parent and children.", (P("Subject", String), P("Skeleton", String), P("Bone", String)), (P("Parent", String), P("Children", Strings))) \
  X(GetConstraintNames, "The names of the constraints of a subject's skeleton.", (P("Subject", String), P("Skeleton", String)), (P("Names", Strings))) \
  X(GetConstraintDetails, "A constraint's state, source, target, offset and type.", (P("Subject", String), P("Skeleton", String), P("Constraint", String)), (P("Active", Bool), P("Source", String), P("Target", String), P("Offset", Floats), P("Type", String))) \
  X(GetSubjectParamNames, "The names of a subject's parameters.", (P("Subject", String), P("Skeleton", String)), (P("Names", Strings))) \
  X(GetSubjectParamDetails, "A subject parameter's value, default, unit and whether it is required.", (P("Subject", String), P("Skeleton", String), P("Parameter", String)), (P("Value", Float), P("DefaultValue", Float), P("Unit", String), P("Required", Bool))) \
  X(GetTrajectory, "A marker's positions and existence flags over the whole take.", (P("Subject", String), P("Marker", String)), (P("X", Doubles), P("Y", Doubles), P("Z", Doubles), P("E", Bools))) \
  X(SetTrajectory, "Replaces a marker's positions and existence flags over the whole take.", (P("Subject", String), P("Marker", String), P("X", Doubles), P("Y", Doubles), P("Z", Doubles), P("E", Bools)), ()) \
  X(GetTrajectoryAtFrame, "A marker's position and existence flag at one frame.", (P("Subject", String), P("Marker", String), P("Frame", Int)), (P("X", Doubles), P("Y", Doubles), P("Z", Doubles), P("E", Bools))) \
  X(SetTrajectoryAtFrame, "Sets a marker's position and existence flag at one frame.", (P("Subject", String), P("Marker", String), P("Frame", Int), P("X", Double), P("Y", Double), P("Z", Double), P("E", Bool)), ()) \
  X(SceneGetObject, "The object at a path.", (P("Path", String)), (P("ID", ULong), P("Type", String))) \
  X(SceneGetObjectList, "The objects of a type.", (P("Type", String)), (P("IDList", ULongs), P("TypeList", Strings))) \
  X(SceneCreateObject, "Creates an object of a type under a parent.", (P("Type", String), P("Name", String), P("Parent", ULong), P("Options", String)), (P("ID", ULong), P("Type", String))) \
  X(SceneRemoveObject, "Removes an object and its descendants.", (P("Object", ULong), P("Options", String)), ()) \
  X(SceneSelectObject, "Changes the selection state of an object.", (P("Object", ULong), P("Options", String), P("Mode", Int)), ()) \
  X(SceneSelectAllObjects, "Selects or deselects every object.", (P("Mode", Int)), ()) \
  X(SceneSelectObjectsOfType, "Changes the selection state of every object of a type.", (P("Type", String), P("Mode", Int)), ()) \
  X(SceneInvertObjectSelection, "Inverts the object selection.", (), ()) \
  X(SceneGetSelectedObjects, "The selected objects.", (), (P("IDList", ULongs), P("TypeList", Strings))) \
  X(SceneGetPrimarySelectedObject, "The object selected first among the selected ones.", (), (P("ID", ULong), P("Type", String))) \
  X(SceneGetActiveClip, "The name of the active clip.", (), (P("Str", String))) \
  X(SceneSetActiveClip, "Makes a clip the active one.", (P("Clip", String)), ()) \
  X(ObjectGetAttribute, "The identifier of an object's attribute.", (P("Object", ULong), P("Attribute", String)), (P("Value", ULong))) \
  X(ObjectGetAttributes, "The identifiers of an object's attributes.", (P("Object", ULong)), (P("ValueList", ULongs))) \
  X(ObjectHasAttribute, "Whether an object has an attribute.", (P("Object", ULong), P("Attribute", ULong)), (P("Value", Int))) \
  X(ObjectGetAttributeValue, "An attribute's value by name.", (P("Object", ULong), P("Attribute", String)), (P("Type", Int), P("Editable", Bool), P("Str", String))) \
  X(ObjectSetAttributeValue, "Sets an attribute's value by name.", (P("Object", ULong), P("Attribute", String), P("Value", String)), ()) \
  X(ObjectGetChannel, "A channel's description by name.", (P("Object", ULong), P("Channel", String)), (P("Type", Int), P("Editable", Bool), P("Str", String))) \
  X(ObjectGetChannels, "The names of an object's channels.", (P("Object", ULong)), (P("Str", String))) \
  X(ObjectHasChannel, "Whether an object has a channel.", (P("Object", ULong), P("Channel", ULong)), (P("Value", Int))) \
  X(ObjectGetParameter, "The identifier of an object's parameter.", (P("Object", ULong), P("Kind", Int), P("Parameter", String)), (P("Value", ULong))) \
  X(ObjectGetParameters, "The identifiers of an object's parameters.", (P("Object", ULong), P("Kind", Int)), (P("ValueList", ULongs))) \
  X(ObjectHasParameter, "Whether an object has a parameter.", (P("Object", ULong), P("Kind", Int), P("Parameter", ULong)), (P("Value", Int))) \
  X(ObjectGetChildren, "An object's children.", (P("Object", ULong)), (P("IDList", ULongs), P("TypeList", Strings))) \
  X(ObjectGetDescendants, "Every object below an object.", (P("Object", ULong)), (P("IDList", ULongs), P("TypeList", Strings))) \
  X(ObjectGetParent, "An object's parent.", (P("Object", ULong)), (P("ID", ULong), P("Type", String))) \
  X(ObjectGetPath, "An object's path.", (P("Object", ULong)), (P("Str", String))) \
  X(ObjectSetParent, "Moves an object under another parent.", (P("Object", ULong), P("Parent", ULong), P("KeepWorld", Bool)), ()) \
  X(ObjectGetType, "An object's type name.", (P("Object", ULong)), (P("Str", String))) \
  X(ObjectSelect, "Changes an object's selection state.", (P("Object", ULong), P("Mode", Int)), ()) \
  X(ObjectSetConstraint, "Enables or disables an object's constraint.", (P("Object", ULong), P("Constraint", Int)), ()) \
  X(AttributeGetName, "An attribute's name.", (P("Object", ULong), P("Attribute", ULong)), (P("Str", String))) \
  X(AttributeGetValue, "An attribute's value.", (P("Object", ULong), P("Attribute", ULong)), (P("Type", Int), P("Editable", Bool), P("Str", String))) \
  X(AttributeSetValue, "Sets an attribute's value.", (P("Object", ULong), P("Attribute", ULong), P("Value", String)), ()) \
  X(ChannelGetName, "A channel's name.", (P("Object", ULong), P("Channel", ULong)), (P("Str", String))) \
  X(ChannelGetValue, "A channel's value at a frame.", (P("Object", ULong), P("Channel", ULong), P("Frame", Int), P("Component", Int), P("Interpolation", Int), P("Options", String)), (P("Type", Int), P("Editable", Bool), P("Str", String))) \
  X(ChannelSetValue, "Sets a channel's value at a frame.", (P("Object", ULong), P("Channel", ULong), P("Frame", Int), P("Component", Int), P("Interpolation", Int), P("Value", String), P("Options", String)), ()) \
  X(ChannelHasKey, "Whether a channel has a key at a frame.", (P("Object", ULong), P("Channel", ULong), P("Frame", Int)), (P("Str", String))) \
  X(ChannelSelectKeys, "Selects a channel's keys.", (P("Object", ULong), P("Channel", ULong)), ()) \
  X(ChannelDeleteKey, "Deletes a channel's key at a frame.", (P("Object", ULong), P("Channel", ULong), P("Frame", Int)), ()) \
  X(ChannelDeleteAllKeys, "Deletes every key of a channel.", (P("Object", ULong), P("Channel", ULong)), ()) \
  X(ChannelDeleteSelectedKeys, "Deletes a channel's selected keys.", (P("Object", ULong), P("Channel", ULong)), ()) \
  X(ChannelSelectKeysFromRanges, "Selects a channel's keys inside the selected time ranges.", (P("Object", ULong), P("Channel", ULong), P("Mode", Int)), ()) \
  X(ChannelSelectAllKeys, "Selects or deselects every key of a channel.", (P("Object", ULong), P("Channel", ULong), P("Mode", Int)), ()) \
  X(ChannelInvertKeySelection, "Inverts a channel's key selection.", (P("Object", ULong), P("Channel", ULong)), ()) \
  X(ChannelGetDefaultValue, "A channel's default value.", (P("Object", ULong), P("Channel", ULong)), (P("Type", Int), P("Editable", Bool), P("Str", String))) \
  X(ChannelSetDefaultValue, "Sets a channel's default value.", (P("Object", ULong), P("Channel", ULong), P("Value", String)), ()) \
  X(ChannelGetGaps, "The frame ranges where a channel has no value.", (P("Object", ULong), P("Channel", ULong), P("Component", Int)), (P("Str", String))) \
  X(ParameterGet, "A field of a parameter.", (P("Object", ULong), P("Parameter", ULong), P("Kind", Int), P("Field", String)), (P("Str", String))) \
  X(ParameterSet, "Sets a field of a parameter.", (P("Object", ULong), P("Parameter", ULong), P("Kind", Int), P("Field", String), P("Value", String)), ()) \
  X(ParameterCreate, "Creates a parameter on an object.", (P("Object", ULong), P("Name", String), P("Kind", Int)), (P("Value", ULong))) \
  X(ParameterRemove, "Removes a parameter from an object.", (P("Object", ULong), P("Parameter", ULong), P("Options", String)), ()) \
  X(AddScriptPath, "Adds a directory to the script search path.", (P("Path", String)), ()) \
  X(RemoveScriptPath, "Removes a directory from the script search path.", (P("Path", String)), ()) \
  X(ReparseScriptPaths, "Reads the script search path again.", (), ()) \
  X(NewScene, "Replaces the scene with an empty one.", (), ()) \
  X(LoadFile, "Loads a scene file.", (P("Path", String)), ()) \
  X(ImportFile, "Imports a file into the scene.", (P("Path", String), P("Format", String), P("Merge", Bool)), ()) \
  X(SaveFile, "Saves the scene to a file.", (P("Path", String), P("Options", String)), ()) \
  X(ExportFile, "Exports the scene's data to a file.", (P("Path", String), P("Format", String)), ()) \
  X(DatabaseCreate, "Creates a capture database.", (P("Path", String), P("Name", String)), ()) \
  X(DatabaseGetCurrent, "The current database, session or take.", (P("Item", String)), (P("Str", String))) \
  X(DatabaseSetCurrent, "Makes a database, session or take the current one.", (P("Item", String), P("Path", String)), ()) \
  X(DatabaseGetMarkedTakes, "The takes marked in the current database.", (), (P("Strings", Strings))) \
  X(TimelineGetTicks, "The current time in ticks.", (), (P("Value", ULong))) \
  X(TimelineSetTicks, "Sets the current time in ticks.", (P("Ticks", ULong)), ()) \
  X(TimelineGetSecs, "The current time in seconds.", (), (P("Value", Float))) \
  X(TimelineSetSecs, "Sets the current time in seconds.", (P("Seconds", Float)), ()) \
  X(TimelineGetFrames, "The current frame.", (), (P("Value", Int))) \
  X(TimelineSetFrames, "Sets the current frame.", (P("Frame", Int)), ()) \
  X(TimelineGetPlayStart, "The first frame of the play range.", (), (P("Value", Int))) \
  X(TimelineSetPlayStart, "Sets the first frame of the play range.", (P("Frame", Int)), ()) \
  X(TimelineGetPlayEnd, "The last frame of the play range.", (), (P("Value", Int))) \
  X(TimelineSetPlayEnd, "Sets the last frame of the play range.", (P("Frame", Int)), ()) \
  X(TimelineGetAnimStart, "The first frame of the animation range.", (), (P("Value", Int))) \
  X(TimelineSetAnimStart, "Sets the first frame of the animation range.", (P("Frame", Int)), ()) \
  X(TimelineGetAnimEnd, "The last frame of the animation range.", (), (P("Value", Int))) \
  X(TimelineSetAnimEnd, "Sets the last frame of the animation range.", (P("Frame", Int)), ()) \
  X(TimelineGetTimeCodeStandard, "The time-code standard.", (), (P("Str", String))) \
  X(TimelineSetTimeCodeStandard, "Sets the time-code standard.", (P("Standard", String)), ()) \
  X(TimelineGetFrameRate, "The frame rate in frames per second.", (), (P("Value", Float))) \
  X(TimelineSetFrameRate, "Sets the frame rate, keeping the current time.", (P("Rate", Float)), ()) \
  X(TimelinePlay, "Starts playback.", (), ()) \
  X(TimelineStop, "Stops playback.", (), ()) \
  X(TimelineSelectRange, "Changes the selection of a range of frames.", (P("Start", Int), P("End", Int), P("Mode", Int)), ()) \
  X(TimelineSelectAll, "Selects or deselects the whole timeline.", (P("Mode", Int)), ()) \
  X(TimelineInvertSelection, "Inverts the timeline selection.", (), ()) \
  X(TimelineSelectRangeFromKeys, "Selects the frame ranges spanned by the selected keys.", (P("Mode", Int)), ()) \
  X(TimelineGetSelectedRanges, "The selected frame ranges as pairs of first and last frame.", (), (P("Integers", Ints))) \
  X(OfflineCalibrateCameras, "Calibrates the cameras from the take's wand data.", (P("Options", String)), ()) \
  X(OfflineLabelROM, "Labels a range-of-motion take.", (P("Subject", String), P("Options", String)), ()) \
  X(OfflineReconstruct, "Reconstructs trajectories from the cameras' centroids.", (P("Options", String)), ()) \
  X(OfflineAutoLabel, "Labels the reconstructed trajectories.", (P("Subject", String), P("Options", String)), ()) \
  X(OfflineCalibrateLabelingSubjects, "Calibrates the labelling subjects.", (P("Subject", String), P("Options", String)), ()) \
  X(OfflineCalibrateSolvingSubjects, "Calibrates the solving subjects.", (P("Subject", String), P("Options", String)), ()) \
  X(OfflineFixOcclusion, "Fills the gaps in the markers' trajectories.", (P("Subject", String), P("Options", String)), ()) \
  X(OfflineCreateSolvingSetupFromLS, "Creates a solving setup from a labelling subject.", (P("Subject", String)), ()) \
  X(OfflineSolve, "Solves the skeleton's motion from the markers.", (P("Subject", String)), ()) \
  X(OfflineRetarget, "Retargets the solved motion.", (P("Subject", String)), ()) \
  X(OfflineQuickPost, "Runs the quick post-processing pipeline.", (P("Subject", String), P("Options", String)), ()) \
  X(OfflineGetCircleFitSettings, "The circle-fitting settings.", (), (CLIENT3_CIRCLE_FIT_SETTINGS)) \
  X(OfflineSetCircleFitSettings, "Sets the circle-fitting settings.", (CLIENT3_CIRCLE_FIT_SETTINGS), ()) \
  X(OfflineGetReconstructSettings, "The reconstruction settings.", (), (CLIENT3_RECONSTRUCT_SETTINGS)) \
  X(OfflineSetReconstructSettings, "Sets the reconstruction settings.", (CLIENT3_RECONSTRUCT_SETTINGS), ()) \
  X(OfflineGetLabelROMSettings, "The range-of-motion labelling settings.", (), (CLIENT3_LABEL_ROM_SETTINGS)) \
  X(OfflineSetLabelROMSettings, "Sets the range-of-motion labelling settings.", (CLIENT3_LABEL_ROM_SETTINGS), ()) \
  X(OfflineGetLabelingSettings, "The labelling settings.", (), (CLIENT3_LABELING_SETTINGS)) \
  X(OfflineSetLabelingSettings, "Sets the labelling settings.", (CLIENT3_LABELING_SETTINGS), ()) \
  X(OfflineGetLabelingSubjectCalibrationSettings, "The labelling-subject calibration settings.", (), (CLIENT3_LABELING_SUBJECT_CALIBRATION_SETTINGS)) \
  X(OfflineSetLabelingSubjectCalibrationSettings, "Sets the labelling-subject calibration settings.", (CLIENT3_LABELING_SUBJECT_CALIBRATION_SETTINGS), ()) \
  X(OfflineGetOcclusionFixingSettings, "The occlusion-fixing settings.", (), (CLIENT3_OCCLUSION_FIXING_SETTINGS)) \
  X(OfflineSetOcclusionFixingSettings, "Sets the occlusion-fixing settings.", (CLIENT3_OCCLUSION_FIXING_SETTINGS), ()) \
  X(OfflineGetSolvingSettings, "The solving settings.", (), (CLIENT3_SOLVING_SETTINGS)) \
  X(OfflineSetSolvingSettings, "Sets the solving settings.", (CLIENT3_SOLVING_SETTINGS), ()) \
  X(FilterApplyFIR, "Applies a low-pass finite-impulse-response filter to a channel.", (P("Object", ULong), P("Channel", ULong), P("Component", String), P("SelectedOnly", Bool), P("Taps", Int), P("Cutoff", Float), P("SampleRate", Float), P("Transition", Float)), ()) \
  X(FilterApplyWeightedAverage, "Applies a weighted moving average to a channel.", (P("Object", ULong), P("Channel", ULong), P("Component", String), P("SelectedOnly", Bool), P("Window", Int), P("Weighting", Int)), ())

enum class Id : std::uint16_t {
#define CLIENT3_ID(name, description, in, out) name,
  CLIENT3_COMMANDS(CLIENT3_ID)
#undef CLIENT3_ID
};

namespace detail {
using enum Type;
#define CLIENT3_PARAMS(name, description, in, out) \
  inline constexpr auto name##In = List in;         \
  inline constexpr auto name##Out = List out;
CLIENT3_COMMANDS(CLIENT3_PARAMS)
#undef CLIENT3_PARAMS
}  // namespace detail

inline constexpr Command kCommands[] = {
#define CLIENT3_COMMAND(name, description, in, out) {#name, description, detail::name##In, detail::name##Out},
    CLIENT3_COMMANDS(CLIENT3_COMMAND)
#undef CLIENT3_COMMAND
};
inline constexpr std::size_t kCommandCount = std::size(kCommands);

constexpr const Command& CommandOf(Id id) { return kCommands[static_cast<std::size_t>(id)]; }

}  // namespace client3::protocol
