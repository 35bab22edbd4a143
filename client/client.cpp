// The client facade: the client's construction, destruction and registration, and one line per
// operation naming its argument kinds after the client. Results are converted by their C++ type:
// records and strings as owned heap copies, bool, unsigned int, and None for void.
#include <optional>
#include <vector>

#include "containers/sequence.h"
#include "records/record.h"
#include "runtime/module.h"
#include "runtime/wrap.h"

namespace client3 {

namespace {

using namespace ZarvoSDKClientCPP;
using C = ZarvoPelluxPostClient;

// The client. None is passed on as no client; the library is then handed a client of its own that
// was never connected and lives for the one call, so every operation answers as unconnected.
template <class Base>
struct ClientKind : Base {
  std::optional<C> spare;
  auto get() {
    if (this->value) return this->value;
    spare.emplace();
    return static_cast<decltype(this->value)>(&*spare);
  }
};
using Client = ClientKind<Pointer<C, cat(NameOf<C>, " *"), Null::Allow>>;
using ConstClient = ClientKind<Pointer<const C, cat(NameOf<C>, " const *"), Null::Allow>>;

// A reference argument: the object itself from its proxy, never a copy; None is refused.
template <class T, Text Type>
struct Reference : Pointer<T, Type> {
  T& get() const { return *this->value; }
};
using Parameters = Reference<std::vector<Type_Parameter>, cat("std::vector< ", NameOf<Type_Parameter>, ",std::allocator< ",
                                                              NameOf<Type_Parameter>, " > > &")>;
template <class S>
using Settings = Reference<const S, cat(NameOf<S>, " const &")>;

using Doubles = SequenceArg<double>;
using Bools = SequenceArg<bool>;

template <Text Op, auto Target, class... K>
using Member = Fn<cat("ZarvoPelluxPostClient_", Op), sizeof...(K) ? Tuple : Object, Target, Client, K...>;
#define CLIENT3_MEMBER(name, ...) Member<#name, &C::name __VA_OPT__(, ) __VA_ARGS__>

using Functions = Table<
    Fn<"new_ZarvoPelluxPostClient", NoArgs, record::Make<C>>,
    Fn<"delete_ZarvoPelluxPostClient", Object, Delete<C>, Disowned<C>>,
    // Connection and the command protocol.
    CLIENT3_MEMBER(Connect, String, Int),
    CLIENT3_MEMBER(Disconnect),
    Fn<"ZarvoPelluxPostClient_IsConnected", Object, &C::IsConnected, ConstClient>,
    CLIENT3_MEMBER(GetCommandList),
    CLIENT3_MEMBER(GetCommandInfo, String),
    CLIENT3_MEMBER(ProcessRequest, String, Parameters),
    CLIENT3_MEMBER(AllocSafeString, String),
    CLIENT3_MEMBER(GetFrameCount),
    CLIENT3_MEMBER(SetLanguage, String),
    CLIENT3_MEMBER(PSL, String),
    CLIENT3_MEMBER(Log, String, String),
    // Scene, subjects and trajectories.
    CLIENT3_MEMBER(GetSceneName),
    CLIENT3_MEMBER(SetSceneName, String),
    CLIENT3_MEMBER(GetSubjectNames),
    CLIENT3_MEMBER(GetMarkerNames, String),
    CLIENT3_MEMBER(GetBoneNames, String, String),
    CLIENT3_MEMBER(GetRootBone, String, String),
    CLIENT3_MEMBER(GetBoneDetails, String, String, String),
    CLIENT3_MEMBER(GetConstraintNames, String, String),
    CLIENT3_MEMBER(GetConstraintDetails, String, String, String),
    CLIENT3_MEMBER(GetSubjectParamNames, String, String),
    CLIENT3_MEMBER(GetSubjectParamDetails, String, String, String),
    CLIENT3_MEMBER(GetTrajectory, String, String),
    CLIENT3_MEMBER(SetTrajectory, String, String, Doubles, Doubles, Doubles, Bools),
    CLIENT3_MEMBER(GetTrajectoryAtFrame, String, String, Int),
    CLIENT3_MEMBER(SetTrajectoryAtFrame, String, String, Int, Double, Double, Double, Bool),
    // Scene objects, attributes, channels and parameters.
    CLIENT3_MEMBER(SceneGetObject, String),
    CLIENT3_MEMBER(SceneGetObjectList, String),
    CLIENT3_MEMBER(SceneCreateObject, String, String, UnsignedLongLong, String),
    CLIENT3_MEMBER(SceneRemoveObject, UnsignedLongLong, String),
    CLIENT3_MEMBER(SceneSelectObject, UnsignedLongLong, String, Int),
    CLIENT3_MEMBER(SceneSelectAllObjects, Int),
    CLIENT3_MEMBER(SceneSelectObjectsOfType, String, Int),
    CLIENT3_MEMBER(SceneInvertObjectSelection),
    CLIENT3_MEMBER(SceneGetSelectedObjects),
    CLIENT3_MEMBER(SceneGetPrimarySelectedObject),
    CLIENT3_MEMBER(SceneGetActiveClip),
    CLIENT3_MEMBER(SceneSetActiveClip, String),
    CLIENT3_MEMBER(ObjectGetAttribute, UnsignedLongLong, String),
    CLIENT3_MEMBER(ObjectGetAttributes, UnsignedLongLong),
    CLIENT3_MEMBER(ObjectHasAttribute, UnsignedLongLong, UnsignedLongLong),
    CLIENT3_MEMBER(ObjectGetAttributeValue, UnsignedLongLong, String),
    CLIENT3_MEMBER(ObjectSetAttributeValue, UnsignedLongLong, String, String),
    CLIENT3_MEMBER(ObjectGetChannel, UnsignedLongLong, String),
    CLIENT3_MEMBER(ObjectGetChannels, UnsignedLongLong),
    CLIENT3_MEMBER(ObjectHasChannel, UnsignedLongLong, UnsignedLongLong),
    CLIENT3_MEMBER(ObjectGetParameter, UnsignedLongLong, Int, String),
    CLIENT3_MEMBER(ObjectGetParameters, UnsignedLongLong, Int),
    CLIENT3_MEMBER(ObjectHasParameter, UnsignedLongLong, Int, UnsignedLongLong),
    CLIENT3_MEMBER(ObjectGetChildren, UnsignedLongLong),
    CLIENT3_MEMBER(ObjectGetDescendants, UnsignedLongLong),
    CLIENT3_MEMBER(ObjectGetParent, UnsignedLongLong),
    CLIENT3_MEMBER(ObjectGetPath, UnsignedLongLong),
    CLIENT3_MEMBER(ObjectSetParent, UnsignedLongLong, UnsignedLongLong, Bool),
    CLIENT3_MEMBER(ObjectGetType, UnsignedLongLong),
    CLIENT3_MEMBER(ObjectSelect, UnsignedLongLong, Int),
    CLIENT3_MEMBER(ObjectSetConstraint, UnsignedLongLong, Int),
    CLIENT3_MEMBER(AttributeGetName, UnsignedLongLong, UnsignedLongLong),
    CLIENT3_MEMBER(AttributeGetValue, UnsignedLongLong, UnsignedLongLong),
    CLIENT3_MEMBER(AttributeSetValue, UnsignedLongLong, UnsignedLongLong, String),
    CLIENT3_MEMBER(ChannelGetName, UnsignedLongLong, UnsignedLongLong),
    CLIENT3_MEMBER(ChannelGetValue, UnsignedLongLong, UnsignedLongLong, Int, Int, Int, String),
    CLIENT3_MEMBER(ChannelSetValue, UnsignedLongLong, UnsignedLongLong, Int, Int, Int, String, String),
    CLIENT3_MEMBER(ChannelHasKey, UnsignedLongLong, UnsignedLongLong, Int),
    CLIENT3_MEMBER(ChannelSelectKeys, UnsignedLongLong, UnsignedLongLong),
    CLIENT3_MEMBER(ChannelDeleteKey, UnsignedLongLong, UnsignedLongLong, Int),
    CLIENT3_MEMBER(ChannelDeleteAllKeys, UnsignedLongLong, UnsignedLongLong),
    CLIENT3_MEMBER(ChannelDeleteSelectedKeys, UnsignedLongLong, UnsignedLongLong),
    CLIENT3_MEMBER(ChannelSelectKeysFromRanges, UnsignedLongLong, UnsignedLongLong, Int),
    CLIENT3_MEMBER(ChannelSelectAllKeys, UnsignedLongLong, UnsignedLongLong, Int),
    CLIENT3_MEMBER(ChannelInvertKeySelection, UnsignedLongLong, UnsignedLongLong),
    CLIENT3_MEMBER(ChannelGetDefaultValue, UnsignedLongLong, UnsignedLongLong),
    CLIENT3_MEMBER(ChannelSetDefaultValue, UnsignedLongLong, UnsignedLongLong, String),
    CLIENT3_MEMBER(ChannelGetGaps, UnsignedLongLong, UnsignedLongLong, Int),
    CLIENT3_MEMBER(ParameterGet, UnsignedLongLong, UnsignedLongLong, Int, String),
    CLIENT3_MEMBER(ParameterSet, UnsignedLongLong, UnsignedLongLong, Int, String, String),
    CLIENT3_MEMBER(ParameterCreate, UnsignedLongLong, String, Int),
    CLIENT3_MEMBER(ParameterRemove, UnsignedLongLong, UnsignedLongLong, String),
    // Files, scripts, the database and the timeline.
    CLIENT3_MEMBER(AddScriptPath, String),
    CLIENT3_MEMBER(RemoveScriptPath, String),
    CLIENT3_MEMBER(ReparseScriptPaths),
    CLIENT3_MEMBER(NewScene),
    CLIENT3_MEMBER(LoadFile, String),
    CLIENT3_MEMBER(ImportFile, String, String, Bool),
    CLIENT3_MEMBER(SaveFile, String, String),
    CLIENT3_MEMBER(ExportFile, String, String),
    CLIENT3_MEMBER(DatabaseCreate, String, String),
    CLIENT3_MEMBER(DatabaseGetCurrent, String),
    CLIENT3_MEMBER(DatabaseSetCurrent, String, String),
    CLIENT3_MEMBER(DatabaseGetMarkedTakes),
    CLIENT3_MEMBER(TimelineGetTicks),
    CLIENT3_MEMBER(TimelineSetTicks, UnsignedLongLong),
    CLIENT3_MEMBER(TimelineGetSecs),
    CLIENT3_MEMBER(TimelineSetSecs, Float),
    CLIENT3_MEMBER(TimelineGetFrames),
    CLIENT3_MEMBER(TimelineSetFrames, Int),
    CLIENT3_MEMBER(TimelineGetPlayStart),
    CLIENT3_MEMBER(TimelineSetPlayStart, Int),
    CLIENT3_MEMBER(TimelineGetPlayEnd),
    CLIENT3_MEMBER(TimelineSetPlayEnd, Int),
    CLIENT3_MEMBER(TimelineGetAnimStart),
    CLIENT3_MEMBER(TimelineSetAnimStart, Int),
    CLIENT3_MEMBER(TimelineGetAnimEnd),
    CLIENT3_MEMBER(TimelineSetAnimEnd, Int),
    CLIENT3_MEMBER(TimelineGetTimeCodeStandard),
    CLIENT3_MEMBER(TimelineSetTimeCodeStandard, String),
    CLIENT3_MEMBER(TimelineGetFrameRate),
    CLIENT3_MEMBER(TimelineSetFrameRate, Float),
    CLIENT3_MEMBER(TimelinePlay),
    CLIENT3_MEMBER(TimelineStop),
    CLIENT3_MEMBER(TimelineSelectRange, Int, Int, Int),
    CLIENT3_MEMBER(TimelineSelectAll, Int),
    CLIENT3_MEMBER(TimelineInvertSelection),
    CLIENT3_MEMBER(TimelineSelectRangeFromKeys, Int),
    CLIENT3_MEMBER(TimelineGetSelectedRanges),
    // Offline processing, settings and filters.
    CLIENT3_MEMBER(OfflineCalibrateCameras, String),
    CLIENT3_MEMBER(OfflineLabelROM, String, String),
    CLIENT3_MEMBER(OfflineReconstruct, String),
    CLIENT3_MEMBER(OfflineAutoLabel, String, String),
    CLIENT3_MEMBER(OfflineCalibrateLabelingSubjects, String, String),
    CLIENT3_MEMBER(OfflineCalibrateSolvingSubjects, String, String),
    CLIENT3_MEMBER(OfflineFixOcclusion, String, String),
    CLIENT3_MEMBER(OfflineCreateSolvingSetupFromLS, String),
    CLIENT3_MEMBER(OfflineSolve, String),
    CLIENT3_MEMBER(OfflineRetarget, String),
    CLIENT3_MEMBER(OfflineQuickPost, String, String),
    CLIENT3_MEMBER(OfflineGetCircleFitSettings),
    CLIENT3_MEMBER(OfflineSetCircleFitSettings, Settings<Output_CircleFitSettings>),
    CLIENT3_MEMBER(OfflineGetReconstructSettings),
    CLIENT3_MEMBER(OfflineSetReconstructSettings, Settings<Output_ReconstructSettings>),
    CLIENT3_MEMBER(OfflineGetLabelROMSettings),
    CLIENT3_MEMBER(OfflineSetLabelROMSettings, Settings<Output_LabelROMSettings>),
    CLIENT3_MEMBER(OfflineGetLabelingSettings),
    CLIENT3_MEMBER(OfflineSetLabelingSettings, Settings<Output_LabelingSettings>),
    CLIENT3_MEMBER(OfflineGetLabelingSubjectCalibrationSettings),
    CLIENT3_MEMBER(OfflineSetLabelingSubjectCalibrationSettings, Settings<Output_LabelingSubjectCalibrationSettings>),
    CLIENT3_MEMBER(OfflineGetOcclusionFixingSettings),
    CLIENT3_MEMBER(OfflineSetOcclusionFixingSettings, Settings<Output_OcclusionFixingSettings>),
    CLIENT3_MEMBER(OfflineGetSolvingSettings),
    CLIENT3_MEMBER(OfflineSetSolvingSettings, Settings<Output_SolvingSettings>),
    CLIENT3_MEMBER(FilterApplyFIR, UnsignedLongLong, UnsignedLongLong, String, Bool, Int, Float, Float, Float),
    CLIENT3_MEMBER(FilterApplyWeightedAverage, UnsignedLongLong, UnsignedLongLong, String, Bool, Int, Int),
    Register<"ZarvoPelluxPostClient", TypeOf<C>>,
    Init<"ZarvoPelluxPostClient">>;

#undef CLIENT3_MEMBER

static_assert(Functions::defs.size() == 146);

}  // namespace

std::span<const PyMethodDef> ClientFunctions() { return Functions::defs; }

}  // namespace client3
