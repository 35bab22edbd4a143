// The client library's client classes. ZarvoPelluxPostClient is the facade of the post-processing
// application: every operation but the first few (connection and text allocation) is one request to
// the application, answered in a record whose Result and ResultString tell how it went.
#pragma once

#include <vector>

#include "ZarvoSDKClientCPP/Outputs.h"
#include "ZarvoSDKClientCPP/SafeString.h"

namespace ZarvoSDKClientCPP {

class ClientConnection;

class ZarvoClient {
public:
  ZarvoClient() = default;
  ZarvoClient(ZarvoClient const&) = delete;
  ZarvoClient& operator=(ZarvoClient const&) = delete;

protected:
  ~ZarvoClient() = default;
};

class ZarvoPelluxPostClient : public ZarvoClient {
public:
  ZarvoPelluxPostClient();
  ~ZarvoPelluxPostClient();

  // Connection and the command protocol.
  Output_Result Connect(SafeString const&, int);
  void Disconnect();
  bool IsConnected() const;
  Output_GetCommandList GetCommandList();
  Output_GetCommandInfo GetCommandInfo(SafeString const&);
  Output_ProcessRequest ProcessRequest(SafeString const&, std::vector<Type_Parameter>&);
  SafeString AllocSafeString(SafeString const&);
  unsigned int GetFrameCount();
  Output_Result SetLanguage(SafeString const&);
  Output_GetString PSL(SafeString const&);
  Output_Result Log(SafeString const&, SafeString const&);

  // Scene, subjects and trajectories.
  Output_GetSceneName GetSceneName();
  bool SetSceneName(SafeString const&);
  Output_GetSubjectNames GetSubjectNames();
  Output_GetMarkerNames GetMarkerNames(SafeString const&);
  Output_GetBoneNames GetBoneNames(SafeString const&, SafeString const&);
  Output_GetRootBone GetRootBone(SafeString const&, SafeString const&);
  Output_GetBoneDetails GetBoneDetails(SafeString const&, SafeString const&, SafeString const&);
  Output_GetConstraintNames GetConstraintNames(SafeString const&, SafeString const&);
  Output_GetConstraintDetails GetConstraintDetails(SafeString const&, SafeString const&, SafeString const&);
  Output_GetSubjectParamNames GetSubjectParamNames(SafeString const&, SafeString const&);
  Output_GetSubjectParamDetails GetSubjectParamDetails(SafeString const&, SafeString const&, SafeString const&);
  Output_GetTrajectory GetTrajectory(SafeString const&, SafeString const&);
  Output_Result SetTrajectory(SafeString const&, SafeString const&, std::vector<double> const&, std::vector<double> const&, std::vector<double> const&, std::vector<bool> const&);
  Output_GetTrajectoryAtFrame GetTrajectoryAtFrame(SafeString const&, SafeString const&, int);
  Output_Result SetTrajectoryAtFrame(SafeString const&, SafeString const&, int, double, double, double, bool);

  // Scene objects, attributes, channels and parameters.
  Output_GetObject SceneGetObject(SafeString const&);
  Output_GetObjectList SceneGetObjectList(SafeString const&);
  Output_GetObject SceneCreateObject(SafeString const&, SafeString const&, unsigned long long, SafeString const&);
  Output_Result SceneRemoveObject(unsigned long long, SafeString const&);
  Output_Result SceneSelectObject(unsigned long long, SafeString const&, int);
  Output_Result SceneSelectAllObjects(int);
  Output_Result SceneSelectObjectsOfType(SafeString const&, int);
  Output_Result SceneInvertObjectSelection();
  Output_GetObjectList SceneGetSelectedObjects();
  Output_GetObject SceneGetPrimarySelectedObject();
  Output_GetString SceneGetActiveClip();
  Output_Result SceneSetActiveClip(SafeString const&);
  Output_GetUnsignedLong ObjectGetAttribute(unsigned long long, SafeString const&);
  Output_GetUnsignedLongList ObjectGetAttributes(unsigned long long);
  Output_GetInteger ObjectHasAttribute(unsigned long long, unsigned long long);
  Output_GetAttribute ObjectGetAttributeValue(unsigned long long, SafeString const&);
  Output_Result ObjectSetAttributeValue(unsigned long long, SafeString const&, SafeString const&);
  Output_GetAttribute ObjectGetChannel(unsigned long long, SafeString const&);
  Output_GetString ObjectGetChannels(unsigned long long);
  Output_GetInteger ObjectHasChannel(unsigned long long, unsigned long long);
  Output_GetUnsignedLong ObjectGetParameter(unsigned long long, int, SafeString const&);
  Output_GetUnsignedLongList ObjectGetParameters(unsigned long long, int);
  Output_GetInteger ObjectHasParameter(unsigned long long, int, unsigned long long);
  Output_GetObjectList ObjectGetChildren(unsigned long long);
  Output_GetObjectList ObjectGetDescendants(unsigned long long);
  Output_GetObject ObjectGetParent(unsigned long long);
  Output_GetString ObjectGetPath(unsigned long long);
  Output_Result ObjectSetParent(unsigned long long, unsigned long long, bool);
  Output_GetString ObjectGetType(unsigned long long);
  Output_Result ObjectSelect(unsigned long long, int);
  Output_Result ObjectSetConstraint(unsigned long long, int);
  Output_GetString AttributeGetName(unsigned long long, unsigned long long);
  Output_GetAttribute AttributeGetValue(unsigned long long, unsigned long long);
  Output_Result AttributeSetValue(unsigned long long, unsigned long long, SafeString const&);
  Output_GetString ChannelGetName(unsigned long long, unsigned long long);
  Output_GetAttribute ChannelGetValue(unsigned long long, unsigned long long, int, int, int, SafeString const&);
  Output_Result ChannelSetValue(unsigned long long, unsigned long long, int, int, int, SafeString const&, SafeString const&);
  Output_GetString ChannelHasKey(unsigned long long, unsigned long long, int);
  Output_Result ChannelSelectKeys(unsigned long long, unsigned long long);
  Output_Result ChannelDeleteKey(unsigned long long, unsigned long long, int);
  Output_Result ChannelDeleteAllKeys(unsigned long long, unsigned long long);
  Output_Result ChannelDeleteSelectedKeys(unsigned long long, unsigned long long);
  Output_Result ChannelSelectKeysFromRanges(unsigned long long, unsigned long long, int);
  Output_Result ChannelSelectAllKeys(unsigned long long, unsigned long long, int);
  Output_Result ChannelInvertKeySelection(unsigned long long, unsigned long long);
  Output_GetAttribute ChannelGetDefaultValue(unsigned long long, unsigned long long);
  Output_Result ChannelSetDefaultValue(unsigned long long, unsigned long long, SafeString const&);
  Output_GetString ChannelGetGaps(unsigned long long, unsigned long long, int);
  Output_GetString ParameterGet(unsigned long long, unsigned long long, int, SafeString const&);
  Output_Result ParameterSet(unsigned long long, unsigned long long, int, SafeString const&, SafeString const&);
  Output_GetUnsignedLong ParameterCreate(unsigned long long, SafeString const&, int);
  Output_Result ParameterRemove(unsigned long long, unsigned long long, SafeString const&);

  // Script paths, files and the capture database.
  Output_Result AddScriptPath(SafeString const&);
  Output_Result RemoveScriptPath(SafeString const&);
  Output_Result ReparseScriptPaths();
  Output_Result NewScene();
  Output_Result LoadFile(SafeString const&);
  Output_Result ImportFile(SafeString const&, SafeString const&, bool);
  Output_Result SaveFile(SafeString const&, SafeString const&);
  Output_Result ExportFile(SafeString const&, SafeString const&);
  Output_Result DatabaseCreate(SafeString const&, SafeString const&);
  Output_GetString DatabaseGetCurrent(SafeString const&);
  Output_Result DatabaseSetCurrent(SafeString const&, SafeString const&);
  Output_GetStringList DatabaseGetMarkedTakes();

  // The timeline.
  Output_GetUnsignedLong TimelineGetTicks();
  Output_Result TimelineSetTicks(unsigned long long);
  Output_GetFloat TimelineGetSecs();
  Output_Result TimelineSetSecs(float);
  Output_GetInteger TimelineGetFrames();
  Output_Result TimelineSetFrames(int);
  Output_GetInteger TimelineGetPlayStart();
  Output_Result TimelineSetPlayStart(int);
  Output_GetInteger TimelineGetPlayEnd();
  Output_Result TimelineSetPlayEnd(int);
  Output_GetInteger TimelineGetAnimStart();
  Output_Result TimelineSetAnimStart(int);
  Output_GetInteger TimelineGetAnimEnd();
  Output_Result TimelineSetAnimEnd(int);
  Output_GetString TimelineGetTimeCodeStandard();
  Output_Result TimelineSetTimeCodeStandard(SafeString const&);
  Output_GetFloat TimelineGetFrameRate();
  Output_Result TimelineSetFrameRate(float);
  Output_Result TimelinePlay();
  Output_Result TimelineStop();
  Output_Result TimelineSelectRange(int, int, int);
  Output_Result TimelineSelectAll(int);
  Output_Result TimelineInvertSelection();
  Output_Result TimelineSelectRangeFromKeys(int);
  Output_GetIntegerList TimelineGetSelectedRanges();

  // Offline processing stages.
  Output_Result OfflineCalibrateCameras(SafeString const&);
  Output_Result OfflineLabelROM(SafeString const&, SafeString const&);
  Output_Result OfflineReconstruct(SafeString const&);
  Output_Result OfflineAutoLabel(SafeString const&, SafeString const&);
  Output_Result OfflineCalibrateLabelingSubjects(SafeString const&, SafeString const&);
  Output_Result OfflineCalibrateSolvingSubjects(SafeString const&, SafeString const&);
  Output_Result OfflineFixOcclusion(SafeString const&, SafeString const&);
  Output_Result OfflineCreateSolvingSetupFromLS(SafeString const&);
  Output_Result OfflineSolve(SafeString const&);
  Output_Result OfflineRetarget(SafeString const&);
  Output_Result OfflineQuickPost(SafeString const&, SafeString const&);

  // Processing settings.
  Output_CircleFitSettings OfflineGetCircleFitSettings();
  Output_Result OfflineSetCircleFitSettings(Output_CircleFitSettings const&);
  Output_ReconstructSettings OfflineGetReconstructSettings();
  Output_Result OfflineSetReconstructSettings(Output_ReconstructSettings const&);
  Output_LabelROMSettings OfflineGetLabelROMSettings();
  Output_Result OfflineSetLabelROMSettings(Output_LabelROMSettings const&);
  Output_LabelingSettings OfflineGetLabelingSettings();
  Output_Result OfflineSetLabelingSettings(Output_LabelingSettings const&);
  Output_LabelingSubjectCalibrationSettings OfflineGetLabelingSubjectCalibrationSettings();
  Output_Result OfflineSetLabelingSubjectCalibrationSettings(Output_LabelingSubjectCalibrationSettings const&);
  Output_OcclusionFixingSettings OfflineGetOcclusionFixingSettings();
  Output_Result OfflineSetOcclusionFixingSettings(Output_OcclusionFixingSettings const&);
  Output_SolvingSettings OfflineGetSolvingSettings();
  Output_Result OfflineSetSolvingSettings(Output_SolvingSettings const&);

  // Channel filters.
  Output_Result FilterApplyFIR(unsigned long long, unsigned long long, SafeString const&, bool, int, float, float, float);
  Output_Result FilterApplyWeightedAverage(unsigned long long, unsigned long long, SafeString const&, bool, int, int);

private:
  ClientConnection* m_Connection;
};

}  // namespace ZarvoSDKClientCPP
