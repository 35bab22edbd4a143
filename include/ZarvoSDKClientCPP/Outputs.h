// The client library's records: the command-protocol parameter pair and the Output_* results and
// settings. Every Output_* record derives from Output_Result by single public inheritance; the
// virtual destructor is the only virtual operation, so a record is destroyed correctly through a
// pointer to its base. Construction, copy and destruction are the implicit members.
#pragma once

#include <string>
#include <vector>

#include "ZarvoSDKClientCPP/SafeString.h"

namespace ZarvoSDKClientCPP {

namespace ResultCode {
// Every 32-bit int is a value of the type: records and ToString take codes beyond the listed ones.
// int is also the type the enumeration has on the library's own platform, so size and layout stay.
enum Enum : int {
  Success = 0,
  UnknownStatus = 1,
  NotConnected = 1000,
  RequestTimedOut = 1001,
  ReplyParsingError = 1002,
  ApplicationError = 1003,
  InvalidFrameNumber = 1004,
  ConversionError = 1005,
  ExpectedOneFrame = 1006,
};
}  // namespace ResultCode

class Type_Parameter {
public:
  SafeString Name;
  SafeString Value;
};

class Output_Result {
public:
  virtual ~Output_Result() = default;
  bool Error() const { return Result != ResultCode::Success; }

  ResultCode::Enum Result;
  SafeString ResultString;
};

// Protocol records.

class Output_ProcessRequest : public Output_Result {
public:
  std::vector<Type_Parameter> OutputParameters;
};

class Output_GetServerInfo : public Output_Result {
public:
  SafeString Program;
  unsigned int MajorVersion;
  unsigned int MinorVersion;
  unsigned int PointVersion;
  SafeString ReleaseType;
};

class Output_GetCommandList : public Output_Result {
public:
  std::vector<SafeString> Commands;
};

class Output_GetCommandInfo : public Output_Result {
public:
  SafeString Name;
  SafeString Description;
  std::vector<Type_Parameter> InputParameters;
  std::vector<Type_Parameter> OutputParameters;

  std::string DefaultOutputString();
};

// Query results.

class Output_GetSceneName : public Output_Result {
public:
  SafeString Name;
  SafeString Path;
};

class Output_GetSubjectNames : public Output_Result {
public:
  std::vector<SafeString> Names;
  std::vector<SafeString> Models;
  std::vector<bool> Active;
};

class Output_GetMarkerNames : public Output_Result {
public:
  std::vector<SafeString> Names;
};

class Output_HasTrajectory : public Output_Result {
public:
  bool Exists;
};

class Output_GetTrajectory : public Output_Result {
public:
  std::vector<double> X;
  std::vector<double> Y;
  std::vector<double> Z;
  std::vector<bool> E;
};

class Output_GetTrajectoryAtFrame : public Output_Result {
public:
  double X;
  double Y;
  double Z;
  bool E;
};

class Output_GetBoneNames : public Output_Result {
public:
  std::vector<SafeString> Names;
};

class Output_GetRootBone : public Output_Result {
public:
  SafeString Name;
};

class Output_GetBoneDetails : public Output_Result {
public:
  SafeString Parent;
  std::vector<SafeString> Children;
};

class Output_GetConstraintNames : public Output_Result {
public:
  std::vector<SafeString> Names;
};

class Output_GetConstraintDetails : public Output_Result {
public:
  bool Active;
  SafeString Source;
  SafeString Target;
  std::vector<float> Offset;
  SafeString Type;
};

class Output_GetSubjectParamNames : public Output_Result {
public:
  std::vector<SafeString> Names;
};

class Output_GetSubjectParamDetails : public Output_Result {
public:
  float Value;
  float DefaultValue;
  SafeString Unit;
  bool Required;
};

class Output_GetObject : public Output_Result {
public:
  unsigned long long ID;
  SafeString Type;
};

class Output_GetObjectList : public Output_Result {
public:
  std::vector<unsigned long long> IDList;
  std::vector<SafeString> TypeList;
};

class Output_GetIntegerList : public Output_Result {
public:
  std::vector<int> Integers;
};

class Output_GetString : public Output_Result {
public:
  SafeString Str;
};

class Output_GetAttribute : public Output_Result {
public:
  int Type;
  bool Editable;
  SafeString Str;
};

class Output_GetStringList : public Output_Result {
public:
  std::vector<SafeString> Strings;
};

class Output_GetInteger : public Output_Result {
public:
  int Value;
};

class Output_GetUnsignedLong : public Output_Result {
public:
  unsigned long long Value;
};

class Output_GetUnsignedLongList : public Output_Result {
public:
  std::vector<unsigned long long> ValueList;
};

class Output_GetFloat : public Output_Result {
public:
  float Value;
};

class Output_GetTakeInfo : public Output_Result {
public:
  SafeString Name;
  SafeString Desc;
  SafeString Notes;
};

// Records the library still declares from earlier versions; no operation returns them.
class Output_GetJointDetails : public Output_Result {};
class Output_GetJointNames : public Output_Result {};
class Output_GetRootSegment : public Output_Result {};
class Output_GetSegmentDetails : public Output_Result {};
class Output_GetSegmentNames : public Output_Result {};
class Output_GetTrialName : public Output_Result {};

// Processing settings: read with an OfflineGet...Settings operation, applied with the matching
// OfflineSet...Settings operation.

class Output_CircleFitSettings : public Output_Result {
public:
  bool Enabled;
  int NumThreads;
  bool EnableVideoCentroids;
};

class Output_ReconstructSettings : public Output_Result {
public:
  double EnvironmentalDriftTolerance;
  unsigned int MinCamsToStartTrajectory;
  unsigned int MinCamsToContinueTrajectory;
  double ReconMinSeparation;
  double MinCentroidRadius;
  double MaxCentroidRadius;
  double MinReconstructionRadius;
  double MaxReconstructionRadius;
  SafeString FitMethod;
  double PredicationMatchFactor;
  unsigned int MinTrajectoryLength;
  double StartupError;
  double PredicationError;
  bool ComputeRadius;
  double MinVolumeX;
  double MinVolumeY;
  double MinVolumeZ;
  double MaxVolumeX;
  double MaxVolumeY;
  double MaxVolumeZ;
  int NumThreads;
};

class Output_LabelingSettings : public Output_Result {
public:
  bool UseLabelingClusters;
  double LabelCompletenessEntranceThreshold;
  bool UseRobustBooting;
  double BootingQuality;
  double BootingVersusTracking;
  double TrackingQuality;
  double SmoothingFactor;
  bool SinglePassLabel;
  int NumThreads;
};

class Output_OcclusionFixingSettings : public Output_Result {
public:
  bool Enabled;
  bool ApplyFixedMarkers;
  double MarkerSmoothing;
  double DataFidelity;
  double TransitionTime;
};

class Output_SolvingSettings : public Output_Result {
public:
  double PriorImportance;
  double MeanPoseRatio;
  int NumThreads;
  bool ExtrapolateFingers;
  double FingerMultiplier;
};

class Output_LabelingSubjectCalibrationSettings : public Output_Result {
public:
  float RestImportance;
  float MarkerImportance;
  float SegmentImportance;
  SafeString Quality;
  SafeString StatsMode;
  SafeString CalibrationMode;
  int ActiveFrames;
  bool AutoSaveZSK;
  bool AutoSavePreCalHDF;
  bool OverwriteRangeTemplates;
  bool ShowCovariance;
};

class Output_LabelROMSettings : public Output_Result {
public:
  float StandardDeviation;
  float SeparationDistance;
};

}  // namespace ZarvoSDKClientCPP
