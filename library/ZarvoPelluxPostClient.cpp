// The client's operations. Each is one request to the application (the command of the same name),
// except the connection's own and AllocSafeString, which the library answers itself.
#include <algorithm>
#include <string>

#include "library/Connection.h"
#include "library/Request.h"

namespace ZarvoSDKClientCPP {

using C = ZarvoPelluxPostClient;
using client3::protocol::Id;
using client3::protocol::Reader;
using request::Ask;
using request::Exchange;

namespace {

// A settings setter sends the record's fields as the command's inputs.
template <Id Command, class S>
Output_Result Settings(ClientConnection* connection, S const& settings) {
  return std::apply([&](auto... field) { return Ask<Command, Output_Result>(connection, settings.*field...); },
                    request::FieldsOf<S>);
}

}  // namespace

C::ZarvoPelluxPostClient() : m_Connection(new ClientConnection) {}
C::~ZarvoPelluxPostClient() { delete m_Connection; }

Output_Result C::Connect(SafeString const& address, int port) {
  Output_Result result{};
  std::string message;
  ResultCode::Enum code = m_Connection->Open(address, port, message);
  request::SetResult(result, code, message);
  return result;
}

void C::Disconnect() { m_Connection->Close(); }

bool C::IsConnected() const { return m_Connection->Connected(); }

SafeString C::AllocSafeString(SafeString const& text) {
  return SafeString(VStringFactory::Instance(), text.Text() ? text.Text() : "");
}

// The parameters are sent as they are; the reply's list of every parameter as used (the inputs,
// defaults filled in, then the outputs) replaces them, and the outputs alone go into the record.
Output_ProcessRequest C::ProcessRequest(SafeString const& command, std::vector<Type_Parameter>& parameters) {
  std::vector<Type_Parameter> used;
  auto result = Exchange<Id::ProcessRequest, Output_ProcessRequest>(
      m_Connection,
      [&](Reader& r, Output_ProcessRequest& record) {
        request::Read(r, used);
        request::ReadFields(r, record);
      },
      command, parameters);
  if (result.Result == ResultCode::Success) parameters = std::move(used);
  return result;
}

unsigned int C::GetFrameCount() {
  unsigned int count = 0;
  Exchange<Id::GetFrameCount, Output_Result>(m_Connection, [&](Reader& r, Output_Result&) { request::Read(r, count); });
  return count;
}

bool C::SetSceneName(SafeString const& name) {
  return Ask<Id::SetSceneName, Output_Result>(m_Connection, name).Result == ResultCode::Success;
}

// The reply carries the frame as arrays of one element each; any other length is refused.
Output_GetTrajectoryAtFrame C::GetTrajectoryAtFrame(SafeString const& subject, SafeString const& marker, int frame) {
  bool oneFrame = true;
  auto result = Exchange<Id::GetTrajectoryAtFrame, Output_GetTrajectoryAtFrame>(
      m_Connection,
      [&](Reader& r, Output_GetTrajectoryAtFrame& record) {
        Output_GetTrajectory frames{};
        request::ReadFields(r, frames);
        oneFrame = frames.X.size() == 1 && frames.Y.size() == 1 && frames.Z.size() == 1 && frames.E.size() == 1;
        if (!oneFrame) return;
        record.X = frames.X[0], record.Y = frames.Y[0], record.Z = frames.Z[0], record.E = frames.E[0];
      },
      subject, marker, frame);
  if (!oneFrame) request::SetResult(result, ResultCode::ExpectedOneFrame, std::string());
  return result;
}

Output_GetCommandList C::GetCommandList() { return Ask<Id::GetCommandList, Output_GetCommandList>(m_Connection); }
Output_GetCommandInfo C::GetCommandInfo(SafeString const& a) { return Ask<Id::GetCommandInfo, Output_GetCommandInfo>(m_Connection, a); }
Output_Result C::SetLanguage(SafeString const& a) { return Ask<Id::SetLanguage, Output_Result>(m_Connection, a); }
Output_GetString C::PSL(SafeString const& a) { return Ask<Id::PSL, Output_GetString>(m_Connection, a); }
Output_Result C::Log(SafeString const& a, SafeString const& b) { return Ask<Id::Log, Output_Result>(m_Connection, a, b); }
Output_GetSceneName C::GetSceneName() { return Ask<Id::GetSceneName, Output_GetSceneName>(m_Connection); }
Output_GetSubjectNames C::GetSubjectNames() { return Ask<Id::GetSubjectNames, Output_GetSubjectNames>(m_Connection); }
Output_GetMarkerNames C::GetMarkerNames(SafeString const& a) { return Ask<Id::GetMarkerNames, Output_GetMarkerNames>(m_Connection, a); }
Output_GetBoneNames C::GetBoneNames(SafeString const& a, SafeString const& b) { return Ask<Id::GetBoneNames, Output_GetBoneNames>(m_Connection, a, b); }
Output_GetRootBone C::GetRootBone(SafeString const& a, SafeString const& b) { return Ask<Id::GetRootBone, Output_GetRootBone>(m_Connection, a, b); }
Output_GetBoneDetails C::GetBoneDetails(SafeString const& a, SafeString const& b, SafeString const& c) { return Ask<Id::GetBoneDetails, Output_GetBoneDetails>(m_Connection, a, b, c); }
Output_GetConstraintNames C::GetConstraintNames(SafeString const& a, SafeString const& b) { return Ask<Id::GetConstraintNames, Output_GetConstraintNames>(m_Connection, a, b); }
Output_GetConstraintDetails C::GetConstraintDetails(SafeString const& a, SafeString const& b, SafeString const& c) { return Ask<Id::GetConstraintDetails, Output_GetConstraintDetails>(m_Connection, a, b, c); }
Output_GetSubjectParamNames C::GetSubjectParamNames(SafeString const& a, SafeString const& b) { return Ask<Id::GetSubjectParamNames, Output_GetSubjectParamNames>(m_Connection, a, b); }
Output_GetSubjectParamDetails C::GetSubjectParamDetails(SafeString const& a, SafeString const& b, SafeString const& c) { return Ask<Id::GetSubjectParamDetails, Output_GetSubjectParamDetails>(m_Connection, a, b, c); }
Output_GetTrajectory C::GetTrajectory(SafeString const& a, SafeString const& b) { return Ask<Id::GetTrajectory, Output_GetTrajectory>(m_Connection, a, b); }
Output_Result C::SetTrajectory(SafeString const& a, SafeString const& b, std::vector<double> const& c, std::vector<double> const& d, std::vector<double> const& e, std::vector<bool> const& f) { return Ask<Id::SetTrajectory, Output_Result>(m_Connection, a, b, c, d, e, f); }
Output_Result C::SetTrajectoryAtFrame(SafeString const& a, SafeString const& b, int c, double d, double e, double f, bool g) { return Ask<Id::SetTrajectoryAtFrame, Output_Result>(m_Connection, a, b, c, d, e, f, g); }
Output_GetObject C::SceneGetObject(SafeString const& a) { return Ask<Id::SceneGetObject, Output_GetObject>(m_Connection, a); }
Output_GetObjectList C::SceneGetObjectList(SafeString const& a) { return Ask<Id::SceneGetObjectList, Output_GetObjectList>(m_Connection, a); }
Output_GetObject C::SceneCreateObject(SafeString const& a, SafeString const& b, unsigned long long c, SafeString const& d) { return Ask<Id::SceneCreateObject, Output_GetObject>(m_Connection, a, b, c, d); }
Output_Result C::SceneRemoveObject(unsigned long long a, SafeString const& b) { return Ask<Id::SceneRemoveObject, Output_Result>(m_Connection, a, b); }
Output_Result C::SceneSelectObject(unsigned long long a, SafeString const& b, int c) { return Ask<Id::SceneSelectObject, Output_Result>(m_Connection, a, b, c); }
Output_Result C::SceneSelectAllObjects(int a) { return Ask<Id::SceneSelectAllObjects, Output_Result>(m_Connection, a); }
Output_Result C::SceneSelectObjectsOfType(SafeString const& a, int b) { return Ask<Id::SceneSelectObjectsOfType, Output_Result>(m_Connection, a, b); }
Output_Result C::SceneInvertObjectSelection() { return Ask<Id::SceneInvertObjectSelection, Output_Result>(m_Connection); }
Output_GetObjectList C::SceneGetSelectedObjects() { return Ask<Id::SceneGetSelectedObjects, Output_GetObjectList>(m_Connection); }
Output_GetObject C::SceneGetPrimarySelectedObject() { return Ask<Id::SceneGetPrimarySelectedObject, Output_GetObject>(m_Connection); }
Output_GetString C::SceneGetActiveClip() { return Ask<Id::SceneGetActiveClip, Output_GetString>(m_Connection); }
Output_Result C::SceneSetActiveClip(SafeString const& a) { return Ask<Id::SceneSetActiveClip, Output_Result>(m_Connection, a); }
Output_GetUnsignedLong C::ObjectGetAttribute(unsigned long long a, SafeString const& b) { return Ask<Id::ObjectGetAttribute, Output_GetUnsignedLong>(m_Connection, a, b); }
Output_GetUnsignedLongList C::ObjectGetAttributes(unsigned long long a) { return Ask<Id::ObjectGetAttributes, Output_GetUnsignedLongList>(m_Connection, a); }
Output_GetInteger C::ObjectHasAttribute(unsigned long long a, unsigned long long b) { return Ask<Id::ObjectHasAttribute, Output_GetInteger>(m_Connection, a, b); }
Output_GetAttribute C::ObjectGetAttributeValue(unsigned long long a, SafeString const& b) { return Ask<Id::ObjectGetAttributeValue, Output_GetAttribute>(m_Connection, a, b); }
Output_Result C::ObjectSetAttributeValue(unsigned long long a, SafeString const& b, SafeString const& c) { return Ask<Id::ObjectSetAttributeValue, Output_Result>(m_Connection, a, b, c); }
Output_GetAttribute C::ObjectGetChannel(unsigned long long a, SafeString const& b) { return Ask<Id::ObjectGetChannel, Output_GetAttribute>(m_Connection, a, b); }
Output_GetString C::ObjectGetChannels(unsigned long long a) { return Ask<Id::ObjectGetChannels, Output_GetString>(m_Connection, a); }
Output_GetInteger C::ObjectHasChannel(unsigned long long a, unsigned long long b) { return Ask<Id::ObjectHasChannel, Output_GetInteger>(m_Connection, a, b); }
Output_GetUnsignedLong C::ObjectGetParameter(unsigned long long a, int b, SafeString const& c) { return Ask<Id::ObjectGetParameter, Output_GetUnsignedLong>(m_Connection, a, b, c); }
Output_GetUnsignedLongList C::ObjectGetParameters(unsigned long long a, int b) { return Ask<Id::ObjectGetParameters, Output_GetUnsignedLongList>(m_Connection, a, b); }
Output_GetInteger C::ObjectHasParameter(unsigned long long a, int b, unsigned long long c) { return Ask<Id::ObjectHasParameter, Output_GetInteger>(m_Connection, a, b, c); }
Output_GetObjectList C::ObjectGetChildren(unsigned long long a) { return Ask<Id::ObjectGetChildren, Output_GetObjectList>(m_Connection, a); }
Output_GetObjectList C::ObjectGetDescendants(unsigned long long a) { return Ask<Id::ObjectGetDescendants, Output_GetObjectList>(m_Connection, a); }
Output_GetObject C::ObjectGetParent(unsigned long long a) { return Ask<Id::ObjectGetParent, Output_GetObject>(m_Connection, a); }
Output_GetString C::ObjectGetPath(unsigned long long a) { return Ask<Id::ObjectGetPath, Output_GetString>(m_Connection, a); }
Output_Result C::ObjectSetParent(unsigned long long a, unsigned long long b, bool c) { return Ask<Id::ObjectSetParent, Output_Result>(m_Connection, a, b, c); }
Output_GetString C::ObjectGetType(unsigned long long a) { return Ask<Id::ObjectGetType, Output_GetString>(m_Connection, a); }
Output_Result C::ObjectSelect(unsigned long long a, int b) { return Ask<Id::ObjectSelect, Output_Result>(m_Connection, a, b); }
Output_Result C::ObjectSetConstraint(unsigned long long a, int b) { return Ask<Id::ObjectSetConstraint, Output_Result>(m_Connection, a, b); }
Output_GetString C::AttributeGetName(unsigned long long a, unsigned long long b) { return Ask<Id::AttributeGetName, Output_GetString>(m_Connection, a, b); }
Output_GetAttribute C::AttributeGetValue(unsigned long long a, unsigned long long b) { return Ask<Id::AttributeGetValue, Output_GetAttribute>(m_Connection, a, b); }
Output_Result C::AttributeSetValue(unsigned long long a, unsigned long long b, SafeString const& c) { return Ask<Id::AttributeSetValue, Output_Result>(m_Connection, a, b, c); }
Output_GetString C::ChannelGetName(unsigned long long a, unsigned long long b) { return Ask<Id::ChannelGetName, Output_GetString>(m_Connection, a, b); }
Output_GetAttribute C::ChannelGetValue(unsigned long long a, unsigned long long b, int c, int d, int e, SafeString const& f) { return Ask<Id::ChannelGetValue, Output_GetAttribute>(m_Connection, a, b, c, d, e, f); }
Output_Result C::ChannelSetValue(unsigned long long a, unsigned long long b, int c, int d, int e, SafeString const& f, SafeString const& g) { return Ask<Id::ChannelSetValue, Output_Result>(m_Connection, a, b, c, d, e, f, g); }
Output_GetString C::ChannelHasKey(unsigned long long a, unsigned long long b, int c) { return Ask<Id::ChannelHasKey, Output_GetString>(m_Connection, a, b, c); }
Output_Result C::ChannelSelectKeys(unsigned long long a, unsigned long long b) { return Ask<Id::ChannelSelectKeys, Output_Result>(m_Connection, a, b); }
Output_Result C::ChannelDeleteKey(unsigned long long a, unsigned long long b, int c) { return Ask<Id::ChannelDeleteKey, Output_Result>(m_Connection, a, b, c); }
Output_Result C::ChannelDeleteAllKeys(unsigned long long a, unsigned long long b) { return Ask<Id::ChannelDeleteAllKeys, Output_Result>(m_Connection, a, b); }
Output_Result C::ChannelDeleteSelectedKeys(unsigned long long a, unsigned long long b) { return Ask<Id::ChannelDeleteSelectedKeys, Output_Result>(m_Connection, a, b); }
Output_Result C::ChannelSelectKeysFromRanges(unsigned long long a, unsigned long long b, int c) { return Ask<Id::ChannelSelectKeysFromRanges, Output_Result>(m_Connection, a, b, c); }
Output_Result C::ChannelSelectAllKeys(unsigned long long a, unsigned long long b, int c) { return Ask<Id::ChannelSelectAllKeys, Output_Result>(m_Connection, a, b, c); }
Output_Result C::ChannelInvertKeySelection(unsigned long long a, unsigned long long b) { return Ask<Id::ChannelInvertKeySelection, Output_Result>(m_Connection, a, b); }
Output_GetAttribute C::ChannelGetDefaultValue(unsigned long long a, unsigned long long b) { return Ask<Id::ChannelGetDefaultValue, Output_GetAttribute>(m_Connection, a, b); }
Output_Result C::ChannelSetDefaultValue(unsigned long long a, unsigned long long b, SafeString const& c) { return Ask<Id::ChannelSetDefaultValue, Output_Result>(m_Connection, a, b, c); }
Output_GetString C::ChannelGetGaps(unsigned long long a, unsigned long long b, int c) { return Ask<Id::ChannelGetGaps, Output_GetString>(m_Connection, a, b, c); }
Output_GetString C::ParameterGet(unsigned long long a, unsigned long long b, int c, SafeString const& d) { return Ask<Id::ParameterGet, Output_GetString>(m_Connection, a, b, c, d); }
Output_Result C::ParameterSet(unsigned long long a, unsigned long long b, int c, SafeString const& d, SafeString const& e) { return Ask<Id::ParameterSet, Output_Result>(m_Connection, a, b, c, d, e); }
Output_GetUnsignedLong C::ParameterCreate(unsigned long long a, SafeString const& b, int c) { return Ask<Id::ParameterCreate, Output_GetUnsignedLong>(m_Connection, a, b, c); }
Output_Result C::ParameterRemove(unsigned long long a, unsigned long long b, SafeString const& c) { return Ask<Id::ParameterRemove, Output_Result>(m_Connection, a, b, c); }
Output_Result C::AddScriptPath(SafeString const& a) { return Ask<Id::AddScriptPath, Output_Result>(m_Connection, a); }
Output_Result C::RemoveScriptPath(SafeString const& a) { return Ask<Id::RemoveScriptPath, Output_Result>(m_Connection, a); }
Output_Result C::ReparseScriptPaths() { return Ask<Id::ReparseScriptPaths, Output_Result>(m_Connection); }
Output_Result C::NewScene() { return Ask<Id::NewScene, Output_Result>(m_Connection); }
Output_Result C::LoadFile(SafeString const& a) { return Ask<Id::LoadFile, Output_Result>(m_Connection, a); }
Output_Result C::ImportFile(SafeString const& a, SafeString const& b, bool c) { return Ask<Id::ImportFile, Output_Result>(m_Connection, a, b, c); }
Output_Result C::SaveFile(SafeString const& a, SafeString const& b) { return Ask<Id::SaveFile, Output_Result>(m_Connection, a, b); }
Output_Result C::ExportFile(SafeString const& a, SafeString const& b) { return Ask<Id::ExportFile, Output_Result>(m_Connection, a, b); }
Output_Result C::DatabaseCreate(SafeString const& a, SafeString const& b) { return Ask<Id::DatabaseCreate, Output_Result>(m_Connection, a, b); }
Output_GetString C::DatabaseGetCurrent(SafeString const& a) { return Ask<Id::DatabaseGetCurrent, Output_GetString>(m_Connection, a); }
Output_Result C::DatabaseSetCurrent(SafeString const& a, SafeString const& b) { return Ask<Id::DatabaseSetCurrent, Output_Result>(m_Connection, a, b); }
Output_GetStringList C::DatabaseGetMarkedTakes() { return Ask<Id::DatabaseGetMarkedTakes, Output_GetStringList>(m_Connection); }
Output_GetUnsignedLong C::TimelineGetTicks() { return Ask<Id::TimelineGetTicks, Output_GetUnsignedLong>(m_Connection); }
Output_Result C::TimelineSetTicks(unsigned long long a) { return Ask<Id::TimelineSetTicks, Output_Result>(m_Connection, a); }
Output_GetFloat C::TimelineGetSecs() { return Ask<Id::TimelineGetSecs, Output_GetFloat>(m_Connection); }
Output_Result C::TimelineSetSecs(float a) { return Ask<Id::TimelineSetSecs, Output_Result>(m_Connection, a); }
Output_GetInteger C::TimelineGetFrames() { return Ask<Id::TimelineGetFrames, Output_GetInteger>(m_Connection); }
Output_Result C::TimelineSetFrames(int a) { return Ask<Id::TimelineSetFrames, Output_Result>(m_Connection, a); }
Output_GetInteger C::TimelineGetPlayStart() { return Ask<Id::TimelineGetPlayStart, Output_GetInteger>(m_Connection); }
Output_Result C::TimelineSetPlayStart(int a) { return Ask<Id::TimelineSetPlayStart, Output_Result>(m_Connection, a); }
Output_GetInteger C::TimelineGetPlayEnd() { return Ask<Id::TimelineGetPlayEnd, Output_GetInteger>(m_Connection); }
Output_Result C::TimelineSetPlayEnd(int a) { return Ask<Id::TimelineSetPlayEnd, Output_Result>(m_Connection, a); }
Output_GetInteger C::TimelineGetAnimStart() { return Ask<Id::TimelineGetAnimStart, Output_GetInteger>(m_Connection); }
Output_Result C::TimelineSetAnimStart(int a) { return Ask<Id::TimelineSetAnimStart, Output_Result>(m_Connection, a); }
Output_GetInteger C::TimelineGetAnimEnd() { return Ask<Id::TimelineGetAnimEnd, Output_GetInteger>(m_Connection); }
Output_Result C::TimelineSetAnimEnd(int a) { return Ask<Id::TimelineSetAnimEnd, Output_Result>(m_Connection, a); }
Output_GetString C::TimelineGetTimeCodeStandard() { return Ask<Id::TimelineGetTimeCodeStandard, Output_GetString>(m_Connection); }
Output_Result C::TimelineSetTimeCodeStandard(SafeString const& a) { return Ask<Id::TimelineSetTimeCodeStandard, Output_Result>(m_Connection, a); }
Output_GetFloat C::TimelineGetFrameRate() { return Ask<Id::TimelineGetFrameRate, Output_GetFloat>(m_Connection); }
Output_Result C::TimelineSetFrameRate(float a) { return Ask<Id::TimelineSetFrameRate, Output_Result>(m_Connection, a); }
Output_Result C::TimelinePlay() { return Ask<Id::TimelinePlay, Output_Result>(m_Connection); }
Output_Result C::TimelineStop() { return Ask<Id::TimelineStop, Output_Result>(m_Connection); }
Output_Result C::TimelineSelectRange(int a, int b, int c) { return Ask<Id::TimelineSelectRange, Output_Result>(m_Connection, a, b, c); }
Output_Result C::TimelineSelectAll(int a) { return Ask<Id::TimelineSelectAll, Output_Result>(m_Connection, a); }
Output_Result C::TimelineInvertSelection() { return Ask<Id::TimelineInvertSelection, Output_Result>(m_Connection); }
Output_Result C::TimelineSelectRangeFromKeys(int a) { return Ask<Id::TimelineSelectRangeFromKeys, Output_Result>(m_Connection, a); }
Output_GetIntegerList C::TimelineGetSelectedRanges() { return Ask<Id::TimelineGetSelectedRanges, Output_GetIntegerList>(m_Connection); }
Output_Result C::OfflineCalibrateCameras(SafeString const& a) { return Ask<Id::OfflineCalibrateCameras, Output_Result>(m_Connection, a); }
Output_Result C::OfflineLabelROM(SafeString const& a, SafeString const& b) { return Ask<Id::OfflineLabelROM, Output_Result>(m_Connection, a, b); }
Output_Result C::OfflineReconstruct(SafeString const& a) { return Ask<Id::OfflineReconstruct, Output_Result>(m_Connection, a); }
Output_Result C::OfflineAutoLabel(SafeString const& a, SafeString const& b) { return Ask<Id::OfflineAutoLabel, Output_Result>(m_Connection, a, b); }
Output_Result C::OfflineCalibrateLabelingSubjects(SafeString const& a, SafeString const& b) { return Ask<Id::OfflineCalibrateLabelingSubjects, Output_Result>(m_Connection, a, b); }
Output_Result C::OfflineCalibrateSolvingSubjects(SafeString const& a, SafeString const& b) { return Ask<Id::OfflineCalibrateSolvingSubjects, Output_Result>(m_Connection, a, b); }
Output_Result C::OfflineFixOcclusion(SafeString const& a, SafeString const& b) { return Ask<Id::OfflineFixOcclusion, Output_Result>(m_Connection, a, b); }
Output_Result C::OfflineCreateSolvingSetupFromLS(SafeString const& a) { return Ask<Id::OfflineCreateSolvingSetupFromLS, Output_Result>(m_Connection, a); }
Output_Result C::OfflineSolve(SafeString const& a) { return Ask<Id::OfflineSolve, Output_Result>(m_Connection, a); }
Output_Result C::OfflineRetarget(SafeString const& a) { return Ask<Id::OfflineRetarget, Output_Result>(m_Connection, a); }
Output_Result C::OfflineQuickPost(SafeString const& a, SafeString const& b) { return Ask<Id::OfflineQuickPost, Output_Result>(m_Connection, a, b); }
Output_CircleFitSettings C::OfflineGetCircleFitSettings() { return Ask<Id::OfflineGetCircleFitSettings, Output_CircleFitSettings>(m_Connection); }
Output_Result C::OfflineSetCircleFitSettings(Output_CircleFitSettings const& a) { return Settings<Id::OfflineSetCircleFitSettings>(m_Connection, a); }
Output_ReconstructSettings C::OfflineGetReconstructSettings() { return Ask<Id::OfflineGetReconstructSettings, Output_ReconstructSettings>(m_Connection); }
Output_Result C::OfflineSetReconstructSettings(Output_ReconstructSettings const& a) { return Settings<Id::OfflineSetReconstructSettings>(m_Connection, a); }
Output_LabelROMSettings C::OfflineGetLabelROMSettings() { return Ask<Id::OfflineGetLabelROMSettings, Output_LabelROMSettings>(m_Connection); }
Output_Result C::OfflineSetLabelROMSettings(Output_LabelROMSettings const& a) { return Settings<Id::OfflineSetLabelROMSettings>(m_Connection, a); }
Output_LabelingSettings C::OfflineGetLabelingSettings() { return Ask<Id::OfflineGetLabelingSettings, Output_LabelingSettings>(m_Connection); }
Output_Result C::OfflineSetLabelingSettings(Output_LabelingSettings const& a) { return Settings<Id::OfflineSetLabelingSettings>(m_Connection, a); }
Output_LabelingSubjectCalibrationSettings C::OfflineGetLabelingSubjectCalibrationSettings() { return Ask<Id::OfflineGetLabelingSubjectCalibrationSettings, Output_LabelingSubjectCalibrationSettings>(m_Connection); }
Output_Result C::OfflineSetLabelingSubjectCalibrationSettings(Output_LabelingSubjectCalibrationSettings const& a) { return Settings<Id::OfflineSetLabelingSubjectCalibrationSettings>(m_Connection, a); }
Output_OcclusionFixingSettings C::OfflineGetOcclusionFixingSettings() { return Ask<Id::OfflineGetOcclusionFixingSettings, Output_OcclusionFixingSettings>(m_Connection); }
Output_Result C::OfflineSetOcclusionFixingSettings(Output_OcclusionFixingSettings const& a) { return Settings<Id::OfflineSetOcclusionFixingSettings>(m_Connection, a); }
Output_SolvingSettings C::OfflineGetSolvingSettings() { return Ask<Id::OfflineGetSolvingSettings, Output_SolvingSettings>(m_Connection); }
Output_Result C::OfflineSetSolvingSettings(Output_SolvingSettings const& a) { return Settings<Id::OfflineSetSolvingSettings>(m_Connection, a); }
Output_Result C::FilterApplyFIR(unsigned long long a, unsigned long long b, SafeString const& c, bool d, int e, float f, float g, float h) { return Ask<Id::FilterApplyFIR, Output_Result>(m_Connection, a, b, c, d, e, f, g, h); }
Output_Result C::FilterApplyWeightedAverage(unsigned long long a, unsigned long long b, SafeString const& c, bool d, int e, int f) { return Ask<Id::FilterApplyWeightedAverage, Output_Result>(m_Connection, a, b, c, d, e, f); }

}  // namespace ZarvoSDKClientCPP
