// The application's commands, declared once. Each line gives a command's name, the result of the
// client's member of that name, what the command does, its inputs and its outputs, each a named and
// typed parameter. The library's members are defined from these lines and the client facade lists
// them; the library encodes its requests from them, the host decodes and answers them, and the
// command list, the command descriptions and the generic request by name are read from them.
#pragma once

#include <array>
#include <cstdint>
#include <span>
#include <string_view>

#include "ZarvoSDKClientCPP/OutputFields.h"

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
template <std::size_t N>
constexpr std::array<Param, N> List(const Param (&params)[N]) {
  return std::to_array(params);
}

struct Command {
  std::string_view name;
  std::string_view description;
  std::span<const Param> in;
  std::span<const Param> out;
};

// The settings records: each is read whole by OfflineGet<Name>Settings and replaced whole by
// OfflineSet<Name>Settings, whose outputs and inputs are the fields of the library's record
// Output_<Name>Settings as ZarvoSDKClientCPP/OutputFields.h describes it. S(X, Name, what) per record,
// in the order of the commands.
#define CLIENT3_SETTINGS(S, X)                                      \
  S(X, CircleFit, "circle-fitting")                                 \
  S(X, Reconstruct, "reconstruction")                               \
  S(X, LabelROM, "range-of-motion labelling")                       \
  S(X, Labeling, "labelling")                                       \
  S(X, LabelingSubjectCalibration, "labelling-subject calibration") \
  S(X, OcclusionFixing, "occlusion-fixing")                         \
  S(X, Solving, "solving")
#define CLIENT3_SETTINGS_COMMANDS(X, record, what)                                                           \
  X(OfflineGet##record##Settings, Output_##record##Settings, "The " what " settings.", (), (record##Fields)) \
  X(OfflineSet##record##Settings, Output_Result, "Sets the " what " settings.", (record##Fields), ())

namespace detail {
using enum Type;

// A settings field's type as the record descriptions spell it, and the type it travels as.
struct SafeString;  // the library's text
template <class T>
struct FieldType;
template <> struct FieldType<bool> { static constexpr Type value = Bool; };
template <> struct FieldType<int> { static constexpr Type value = Int; };
template <> struct FieldType<unsigned int> { static constexpr Type value = UInt; };
template <> struct FieldType<float> { static constexpr Type value = Float; };
template <> struct FieldType<double> { static constexpr Type value = Double; };
template <> struct FieldType<SafeString> { static constexpr Type value = String; };

#define CLIENT3_SETTINGS_FIELD(type, name, ...) P(#name, FieldType<type>::value),
#define CLIENT3_SETTINGS_FIELDS(X, record, what) \
  inline constexpr Param record##Fields[] = {ZARVO_FIELDS_Output_##record##Settings(CLIENT3_SETTINGS_FIELD)};
CLIENT3_SETTINGS(CLIENT3_SETTINGS_FIELDS, )
#undef CLIENT3_SETTINGS_FIELDS
#undef CLIENT3_SETTINGS_FIELD

}  // namespace detail

// X(name, result, description, (inputs), (outputs)): a command's name, the type of what the client's
// member of that name returns (a record, or for two members a plain value), what the command does,
// and its inputs and outputs.
//
// The commands the application answers but the client has no member for.
#define CLIENT3_HOST_COMMANDS(X) \
  X(GetServerInfo, Output_GetServerInfo, "The application's name, version and release type.", (), (P("Program", String), P("MajorVersion", UInt), P("MinorVersion", UInt), P("PointVersion", UInt), P("ReleaseType", String)))
// The commands of the command protocol, which the client's table lists first.
#define CLIENT3_PROTOCOL_COMMANDS(X) \
  X(GetCommandList, Output_GetCommandList, "The names of every command the application answers.", (), (P("Commands", Strings))) \
  X(GetCommandInfo, Output_GetCommandInfo, "A command's description and its input and output parameters with their defaults.", (P("Command", String)), (P("Name", String), P("Description", String), P("InputParameters", Params), P("OutputParameters", Params))) \
  X(ProcessRequest, Output_ProcessRequest, "Runs a command by name with its parameters given as text.", (P("Command", String), P("Parameters", Params)), (P("Parameters", Params), P("OutputParameters", Params)))
// The other commands, each a member of the client of the same name, in the order the client lists them.
#define CLIENT3_MEMBER_COMMANDS(X) \
  X(GetFrameCount, unsigned int, "The number of frames in the take.", (), (P("Count", UInt))) \
  X(SetLanguage, Output_Result, "Sets the language of the application's messages.", (P("Language", String)), ()) \
  X(PSL, Output_GetString, "Runs one command written as text: its name followed by Name=Value pairs.", (P("Text", String)), (P("Str", String))) \
  X(Log, Output_Result, "Writes a message to the application's log at the given level.", (P("Level", String), P("Message", String)), ()) \
  X(GetSceneName, Output_GetSceneName, "The scene's name and the path of the file it was loaded from or saved to.", (), (P("Name", String), P("Path", String))) \
  X(SetSceneName, bool, "Renames the scene.", (P("Name", String)), ()) \
  X(GetSubjectNames, Output_GetSubjectNames, "The subjects in the scene with their models and whether each is active.", (), (P("Names", Strings), P("Models", Strings), P("Active", Bools))) \
  X(GetMarkerNames, Output_GetMarkerNames, "The names of a subject's markers.", (P("Subject", String)), (P("Names", Strings))) \
  X(GetBoneNames, Output_GetBoneNames, "The names of the bones of a subject's skeleton.", (P("Subject", String), P("Skeleton", String)), (P("Names", Strings))) \
  X(GetRootBone, Output_GetRootBone, "The root bone of a subject's skeleton.", (P("Subject", String), P("Skeleton", String)), (P("Name", String))) \
  X(GetBoneDetails, Output_GetBoneDetails, "A bone's parent and children.", (P("Subject", String), P("Skeleton", String), P("Bone", String)), (P("Parent", String), P("Children", Strings))) \
  X(GetConstraintNames, Output_GetConstraintNames, "The names of the constraints of a subject's skeleton.", (P("Subject", String), P("Skeleton", String)), (P("Names", Strings))) \
  X(GetConstraintDetails, Output_GetConstraintDetails, "A constraint's state, source, target, offset and type.", (P("Subject", String), P("Skeleton", String), P("Constraint", String)), (P("Active", Bool), P("Source", String), P("Target", String), P("Offset", Floats), P("Type", String))) \
  X(GetSubjectParamNames, Output_GetSubjectParamNames, "The names of a subject's parameters.", (P("Subject", String), P("Skeleton", String)), (P("Names", Strings))) \
  X(GetSubjectParamDetails, Output_GetSubjectParamDetails, "A subject parameter's value, default, unit and whether it is required.", (P("Subject", String), P("Skeleton", String), P("Parameter", String)), (P("Value", Float), P("DefaultValue", Float), P("Unit", String), P("Required", Bool))) \
  X(GetTrajectory, Output_GetTrajectory, "A marker's positions and existence flags over the whole take.", (P("Subject", String), P("Marker", String)), (P("X", Doubles), P("Y", Doubles), P("Z", Doubles), P("E", Bools))) \
  X(SetTrajectory, Output_Result, "Replaces a marker's positions and existence flags over the whole take.", (P("Subject", String), P("Marker", String), P("X", Doubles), P("Y", Doubles), P("Z", Doubles), P("E", Bools)), ()) \
  X(GetTrajectoryAtFrame, Output_GetTrajectoryAtFrame, "A marker's position and existence flag at one frame.", (P("Subject", String), P("Marker", String), P("Frame", Int)), (P("X", Doubles), P("Y", Doubles), P("Z", Doubles), P("E", Bools))) \
  X(SetTrajectoryAtFrame, Output_Result, "Sets a marker's position and existence flag at one frame.", (P("Subject", String), P("Marker", String), P("Frame", Int), P("X", Double), P("Y", Double), P("Z", Double), P("E", Bool)), ()) \
  X(SceneGetObject, Output_GetObject, "The object at a path.", (P("Path", String)), (P("ID", ULong), P("Type", String))) \
  X(SceneGetObjectList, Output_GetObjectList, "The objects of a type.", (P("Type", String)), (P("IDList", ULongs), P("TypeList", Strings))) \
  X(SceneCreateObject, Output_GetObject, "Creates an object of a type under a parent.", (P("Type", String), P("Name", String), P("Parent", ULong), P("Options", String)), (P("ID", ULong), P("Type", String))) \
  X(SceneRemoveObject, Output_Result, "Removes an object and its descendants.", (P("Object", ULong), P("Options", String)), ()) \
  X(SceneSelectObject, Output_Result, "Changes the selection state of an object.", (P("Object", ULong), P("Options", String), P("Mode", Int)), ()) \
  X(SceneSelectAllObjects, Output_Result, "Selects or deselects every object.", (P("Mode", Int)), ()) \
  X(SceneSelectObjectsOfType, Output_Result, "Changes the selection state of every object of a type.", (P("Type", String), P("Mode", Int)), ()) \
  X(SceneInvertObjectSelection, Output_Result, "Inverts the object selection.", (), ()) \
  X(SceneGetSelectedObjects, Output_GetObjectList, "The selected objects.", (), (P("IDList", ULongs), P("TypeList", Strings))) \
  X(SceneGetPrimarySelectedObject, Output_GetObject, "The object selected first among the selected ones.", (), (P("ID", ULong), P("Type", String))) \
  X(SceneGetActiveClip, Output_GetString, "The name of the active clip.", (), (P("Str", String))) \
  X(SceneSetActiveClip, Output_Result, "Makes a clip the active one.", (P("Clip", String)), ()) \
  X(ObjectGetAttribute, Output_GetUnsignedLong, "The identifier of an object's attribute.", (P("Object", ULong), P("Attribute", String)), (P("Value", ULong))) \
  X(ObjectGetAttributes, Output_GetUnsignedLongList, "The identifiers of an object's attributes.", (P("Object", ULong)), (P("ValueList", ULongs))) \
  X(ObjectHasAttribute, Output_GetInteger, "Whether an object has an attribute.", (P("Object", ULong), P("Attribute", ULong)), (P("Value", Int))) \
  X(ObjectGetAttributeValue, Output_GetAttribute, "An attribute's value by name.", (P("Object", ULong), P("Attribute", String)), (P("Type", Int), P("Editable", Bool), P("Str", String))) \
  X(ObjectSetAttributeValue, Output_Result, "Sets an attribute's value by name.", (P("Object", ULong), P("Attribute", String), P("Value", String)), ()) \
  X(ObjectGetChannel, Output_GetAttribute, "A channel's description by name.", (P("Object", ULong), P("Channel", String)), (P("Type", Int), P("Editable", Bool), P("Str", String))) \
  X(ObjectGetChannels, Output_GetString, "The names of an object's channels.", (P("Object", ULong)), (P("Str", String))) \
  X(ObjectHasChannel, Output_GetInteger, "Whether an object has a channel.", (P("Object", ULong), P("Channel", ULong)), (P("Value", Int))) \
  X(ObjectGetParameter, Output_GetUnsignedLong, "The identifier of an object's parameter.", (P("Object", ULong), P("Kind", Int), P("Parameter", String)), (P("Value", ULong))) \
  X(ObjectGetParameters, Output_GetUnsignedLongList, "The identifiers of an object's parameters.", (P("Object", ULong), P("Kind", Int)), (P("ValueList", ULongs))) \
  X(ObjectHasParameter, Output_GetInteger, "Whether an object has a parameter.", (P("Object", ULong), P("Kind", Int), P("Parameter", ULong)), (P("Value", Int))) \
  X(ObjectGetChildren, Output_GetObjectList, "An object's children.", (P("Object", ULong)), (P("IDList", ULongs), P("TypeList", Strings))) \
  X(ObjectGetDescendants, Output_GetObjectList, "Every object below an object.", (P("Object", ULong)), (P("IDList", ULongs), P("TypeList", Strings))) \
  X(ObjectGetParent, Output_GetObject, "An object's parent.", (P("Object", ULong)), (P("ID", ULong), P("Type", String))) \
  X(ObjectGetPath, Output_GetString, "An object's path.", (P("Object", ULong)), (P("Str", String))) \
  X(ObjectSetParent, Output_Result, "Moves an object under another parent.", (P("Object", ULong), P("Parent", ULong), P("KeepWorld", Bool)), ()) \
  X(ObjectGetType, Output_GetString, "An object's type name.", (P("Object", ULong)), (P("Str", String))) \
  X(ObjectSelect, Output_Result, "Changes an object's selection state.", (P("Object", ULong), P("Mode", Int)), ()) \
  X(ObjectSetConstraint, Output_Result, "Enables or disables an object's constraint.", (P("Object", ULong), P("Constraint", Int)), ()) \
  X(AttributeGetName, Output_GetString, "An attribute's name.", (P("Object", ULong), P("Attribute", ULong)), (P("Str", String))) \
  X(AttributeGetValue, Output_GetAttribute, "An attribute's value.", (P("Object", ULong), P("Attribute", ULong)), (P("Type", Int), P("Editable", Bool), P("Str", String))) \
  X(AttributeSetValue, Output_Result, "Sets an attribute's value.", (P("Object", ULong), P("Attribute", ULong), P("Value", String)), ()) \
  X(ChannelGetName, Output_GetString, "A channel's name.", (P("Object", ULong), P("Channel", ULong)), (P("Str", String))) \
  X(ChannelGetValue, Output_GetAttribute, "A channel's value at a frame.", (P("Object", ULong), P("Channel", ULong), P("Frame", Int), P("Component", Int), P("Interpolation", Int), P("Options", String)), (P("Type", Int), P("Editable", Bool), P("Str", String))) \
  X(ChannelSetValue, Output_Result, "Sets a channel's value at a frame.", (P("Object", ULong), P("Channel", ULong), P("Frame", Int), P("Component", Int), P("Interpolation", Int), P("Value", String), P("Options", String)), ()) \
  X(ChannelHasKey, Output_GetString, "Whether a channel has a key at a frame.", (P("Object", ULong), P("Channel", ULong), P("Frame", Int)), (P("Str", String))) \
  X(ChannelSelectKeys, Output_Result, "Selects a channel's keys.", (P("Object", ULong), P("Channel", ULong)), ()) \
  X(ChannelDeleteKey, Output_Result, "Deletes a channel's key at a frame.", (P("Object", ULong), P("Channel", ULong), P("Frame", Int)), ()) \
  X(ChannelDeleteAllKeys, Output_Result, "Deletes every key of a channel.", (P("Object", ULong), P("Channel", ULong)), ()) \
  X(ChannelDeleteSelectedKeys, Output_Result, "Deletes a channel's selected keys.", (P("Object", ULong), P("Channel", ULong)), ()) \
  X(ChannelSelectKeysFromRanges, Output_Result, "Selects a channel's keys inside the selected time ranges.", (P("Object", ULong), P("Channel", ULong), P("Mode", Int)), ()) \
  X(ChannelSelectAllKeys, Output_Result, "Selects or deselects every key of a channel.", (P("Object", ULong), P("Channel", ULong), P("Mode", Int)), ()) \
  X(ChannelInvertKeySelection, Output_Result, "Inverts a channel's key selection.", (P("Object", ULong), P("Channel", ULong)), ()) \
  X(ChannelGetDefaultValue, Output_GetAttribute, "A channel's default value.", (P("Object", ULong), P("Channel", ULong)), (P("Type", Int), P("Editable", Bool), P("Str", String))) \
  X(ChannelSetDefaultValue, Output_Result, "Sets a channel's default value.", (P("Object", ULong), P("Channel", ULong), P("Value", String)), ()) \
  X(ChannelGetGaps, Output_GetString, "The frame ranges where a channel has no value.", (P("Object", ULong), P("Channel", ULong), P("Component", Int)), (P("Str", String))) \
  X(ParameterGet, Output_GetString, "A field of a parameter.", (P("Object", ULong), P("Parameter", ULong), P("Kind", Int), P("Field", String)), (P("Str", String))) \
  X(ParameterSet, Output_Result, "Sets a field of a parameter.", (P("Object", ULong), P("Parameter", ULong), P("Kind", Int), P("Field", String), P("Value", String)), ()) \
  X(ParameterCreate, Output_GetUnsignedLong, "Creates a parameter on an object.", (P("Object", ULong), P("Name", String), P("Kind", Int)), (P("Value", ULong))) \
  X(ParameterRemove, Output_Result, "Removes a parameter from an object.", (P("Object", ULong), P("Parameter", ULong), P("Options", String)), ()) \
  X(AddScriptPath, Output_Result, "Adds a directory to the script search path.", (P("Path", String)), ()) \
  X(RemoveScriptPath, Output_Result, "Removes a directory from the script search path.", (P("Path", String)), ()) \
  X(ReparseScriptPaths, Output_Result, "Reads the script search path again.", (), ()) \
  X(NewScene, Output_Result, "Replaces the scene with an empty one.", (), ()) \
  X(LoadFile, Output_Result, "Loads a scene file.", (P("Path", String)), ()) \
  X(ImportFile, Output_Result, "Imports a file into the scene.", (P("Path", String), P("Format", String), P("Merge", Bool)), ()) \
  X(SaveFile, Output_Result, "Saves the scene to a file.", (P("Path", String), P("Options", String)), ()) \
  X(ExportFile, Output_Result, "Exports the scene's data to a file.", (P("Path", String), P("Format", String)), ()) \
  X(DatabaseCreate, Output_Result, "Creates a capture database.", (P("Path", String), P("Name", String)), ()) \
  X(DatabaseGetCurrent, Output_GetString, "The current database, session or take.", (P("Item", String)), (P("Str", String))) \
  X(DatabaseSetCurrent, Output_Result, "Makes a database, session or take the current one.", (P("Item", String), P("Path", String)), ()) \
  X(DatabaseGetMarkedTakes, Output_GetStringList, "The takes marked in the current database.", (), (P("Strings", Strings))) \
  X(TimelineGetTicks, Output_GetUnsignedLong, "The current time in ticks.", (), (P("Value", ULong))) \
  X(TimelineSetTicks, Output_Result, "Sets the current time in ticks.", (P("Ticks", ULong)), ()) \
  X(TimelineGetSecs, Output_GetFloat, "The current time in seconds.", (), (P("Value", Float))) \
  X(TimelineSetSecs, Output_Result, "Sets the current time in seconds.", (P("Seconds", Float)), ()) \
  X(TimelineGetFrames, Output_GetInteger, "The current frame.", (), (P("Value", Int))) \
  X(TimelineSetFrames, Output_Result, "Sets the current frame.", (P("Frame", Int)), ()) \
  X(TimelineGetPlayStart, Output_GetInteger, "The first frame of the play range.", (), (P("Value", Int))) \
  X(TimelineSetPlayStart, Output_Result, "Sets the first frame of the play range.", (P("Frame", Int)), ()) \
  X(TimelineGetPlayEnd, Output_GetInteger, "The last frame of the play range.", (), (P("Value", Int))) \
  X(TimelineSetPlayEnd, Output_Result, "Sets the last frame of the play range.", (P("Frame", Int)), ()) \
  X(TimelineGetAnimStart, Output_GetInteger, "The first frame of the animation range.", (), (P("Value", Int))) \
  X(TimelineSetAnimStart, Output_Result, "Sets the first frame of the animation range.", (P("Frame", Int)), ()) \
  X(TimelineGetAnimEnd, Output_GetInteger, "The last frame of the animation range.", (), (P("Value", Int))) \
  X(TimelineSetAnimEnd, Output_Result, "Sets the last frame of the animation range.", (P("Frame", Int)), ()) \
  X(TimelineGetTimeCodeStandard, Output_GetString, "The time-code standard.", (), (P("Str", String))) \
  X(TimelineSetTimeCodeStandard, Output_Result, "Sets the time-code standard.", (P("Standard", String)), ()) \
  X(TimelineGetFrameRate, Output_GetFloat, "The frame rate in frames per second.", (), (P("Value", Float))) \
  X(TimelineSetFrameRate, Output_Result, "Sets the frame rate, keeping the current time.", (P("Rate", Float)), ()) \
  X(TimelinePlay, Output_Result, "Starts playback.", (), ()) \
  X(TimelineStop, Output_Result, "Stops playback.", (), ()) \
  X(TimelineSelectRange, Output_Result, "Changes the selection of a range of frames.", (P("Start", Int), P("End", Int), P("Mode", Int)), ()) \
  X(TimelineSelectAll, Output_Result, "Selects or deselects the whole timeline.", (P("Mode", Int)), ()) \
  X(TimelineInvertSelection, Output_Result, "Inverts the timeline selection.", (), ()) \
  X(TimelineSelectRangeFromKeys, Output_Result, "Selects the frame ranges spanned by the selected keys.", (P("Mode", Int)), ()) \
  X(TimelineGetSelectedRanges, Output_GetIntegerList, "The selected frame ranges as pairs of first and last frame.", (), (P("Integers", Ints))) \
  X(OfflineCalibrateCameras, Output_Result, "Calibrates the cameras from the take's wand data.", (P("Options", String)), ()) \
  X(OfflineLabelROM, Output_Result, "Labels a range-of-motion take.", (P("Subject", String), P("Options", String)), ()) \
  X(OfflineReconstruct, Output_Result, "Reconstructs trajectories from the cameras' centroids.", (P("Options", String)), ()) \
  X(OfflineAutoLabel, Output_Result, "Labels the reconstructed trajectories.", (P("Subject", String), P("Options", String)), ()) \
  X(OfflineCalibrateLabelingSubjects, Output_Result, "Calibrates the labelling subjects.", (P("Subject", String), P("Options", String)), ()) \
  X(OfflineCalibrateSolvingSubjects, Output_Result, "Calibrates the solving subjects.", (P("Subject", String), P("Options", String)), ()) \
  X(OfflineFixOcclusion, Output_Result, "Fills the gaps in the markers' trajectories.", (P("Subject", String), P("Options", String)), ()) \
  X(OfflineCreateSolvingSetupFromLS, Output_Result, "Creates a solving setup from a labelling subject.", (P("Subject", String)), ()) \
  X(OfflineSolve, Output_Result, "Solves the skeleton's motion from the markers.", (P("Subject", String)), ()) \
  X(OfflineRetarget, Output_Result, "Retargets the solved motion.", (P("Subject", String)), ()) \
  X(OfflineQuickPost, Output_Result, "Runs the quick post-processing pipeline.", (P("Subject", String), P("Options", String)), ()) \
  CLIENT3_SETTINGS(CLIENT3_SETTINGS_COMMANDS, X) \
  X(FilterApplyFIR, Output_Result, "Applies a low-pass finite-impulse-response filter to a channel.", (P("Object", ULong), P("Channel", ULong), P("Component", String), P("SelectedOnly", Bool), P("Taps", Int), P("Cutoff", Float), P("SampleRate", Float), P("Transition", Float)), ()) \
  X(FilterApplyWeightedAverage, Output_Result, "Applies a weighted moving average to a channel.", (P("Object", ULong), P("Channel", ULong), P("Component", String), P("SelectedOnly", Bool), P("Window", Int), P("Weighting", Int)), ())

// Every command the client has a member for, and every command, in the order of their numbers.
#define CLIENT3_CLIENT_COMMANDS(X) CLIENT3_PROTOCOL_COMMANDS(X) CLIENT3_MEMBER_COMMANDS(X)
#define CLIENT3_COMMANDS(X) CLIENT3_HOST_COMMANDS(X) CLIENT3_CLIENT_COMMANDS(X)

enum class Id : std::uint16_t {
#define CLIENT3_ID(name, result, description, in, out) name,
  CLIENT3_COMMANDS(CLIENT3_ID)
#undef CLIENT3_ID
};

namespace detail {
#define CLIENT3_PARAMS(name, result, description, in, out) \
  inline constexpr auto name##In = List in;         \
  inline constexpr auto name##Out = List out;
CLIENT3_COMMANDS(CLIENT3_PARAMS)
#undef CLIENT3_PARAMS
}  // namespace detail

inline constexpr Command kCommands[] = {
#define CLIENT3_COMMAND(name, result, description, in, out) {#name, description, detail::name##In, detail::name##Out},
    CLIENT3_COMMANDS(CLIENT3_COMMAND)
#undef CLIENT3_COMMAND
};
inline constexpr std::size_t kCommandCount = std::size(kCommands);

constexpr const Command& CommandOf(Id id) { return kCommands[static_cast<std::size_t>(id)]; }

}  // namespace client3::protocol
