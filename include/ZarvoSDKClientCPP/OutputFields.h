// The fields of the library's records, one table per record in declaration order; Outputs.h declares
// the classes from these tables. Each row is FIELD(type, name). A field of a settings record also
// gives the value the application starts with and what it accepts:
//
//   FIELD(type, name, default, least, most)   a number from least to most
//   FIELD(SafeString, name, default, "A|B")   a text that is one of the words
//   FIELD(bool, name, default)                a flag
//
// and ORDER(low, high) rows name two fields of a record where the first may not exceed the second.
// This header only defines macros; it needs nothing included before it.
#pragma once

#define ZARVO_FIELDS_Type_Parameter(FIELD) \
  FIELD(SafeString, Name)                  \
  FIELD(SafeString, Value)

#define ZARVO_FIELDS_Output_Result(FIELD) \
  FIELD(ResultCode::Enum, Result)         \
  FIELD(SafeString,       ResultString)

// ---- Protocol records ---------------------------------------------------------------------------

#define ZARVO_FIELDS_Output_ProcessRequest(FIELD)      \
  FIELD(std::vector<Type_Parameter>, OutputParameters)

#define ZARVO_FIELDS_Output_GetServerInfo(FIELD) \
  FIELD(SafeString,   Program)                   \
  FIELD(unsigned int, MajorVersion)              \
  FIELD(unsigned int, MinorVersion)              \
  FIELD(unsigned int, PointVersion)              \
  FIELD(SafeString,   ReleaseType)

#define ZARVO_FIELDS_Output_GetCommandList(FIELD) \
  FIELD(std::vector<SafeString>, Commands)

#define ZARVO_FIELDS_Output_GetCommandInfo(FIELD)      \
  FIELD(SafeString,                  Name)             \
  FIELD(SafeString,                  Description)      \
  FIELD(std::vector<Type_Parameter>, InputParameters)  \
  FIELD(std::vector<Type_Parameter>, OutputParameters)

// ---- Query results ------------------------------------------------------------------------------

#define ZARVO_FIELDS_Output_GetSceneName(FIELD) \
  FIELD(SafeString, Name)                       \
  FIELD(SafeString, Path)

#define ZARVO_FIELDS_Output_GetSubjectNames(FIELD) \
  FIELD(std::vector<SafeString>, Names)            \
  FIELD(std::vector<SafeString>, Models)           \
  FIELD(std::vector<bool>,       Active)

#define ZARVO_FIELDS_Output_GetMarkerNames(FIELD) \
  FIELD(std::vector<SafeString>, Names)

#define ZARVO_FIELDS_Output_HasTrajectory(FIELD) \
  FIELD(bool, Exists)

#define ZARVO_FIELDS_Output_GetTrajectory(FIELD) \
  FIELD(std::vector<double>, X)                  \
  FIELD(std::vector<double>, Y)                  \
  FIELD(std::vector<double>, Z)                  \
  FIELD(std::vector<bool>,   E)

#define ZARVO_FIELDS_Output_GetTrajectoryAtFrame(FIELD) \
  FIELD(double, X)                                      \
  FIELD(double, Y)                                      \
  FIELD(double, Z)                                      \
  FIELD(bool,   E)

#define ZARVO_FIELDS_Output_GetBoneNames(FIELD) \
  FIELD(std::vector<SafeString>, Names)

#define ZARVO_FIELDS_Output_GetRootBone(FIELD) \
  FIELD(SafeString, Name)

#define ZARVO_FIELDS_Output_GetBoneDetails(FIELD) \
  FIELD(SafeString,              Parent)          \
  FIELD(std::vector<SafeString>, Children)

#define ZARVO_FIELDS_Output_GetConstraintNames(FIELD) \
  FIELD(std::vector<SafeString>, Names)

#define ZARVO_FIELDS_Output_GetConstraintDetails(FIELD) \
  FIELD(bool,               Active)                     \
  FIELD(SafeString,         Source)                     \
  FIELD(SafeString,         Target)                     \
  FIELD(std::vector<float>, Offset)                     \
  FIELD(SafeString,         Type)

#define ZARVO_FIELDS_Output_GetSubjectParamNames(FIELD) \
  FIELD(std::vector<SafeString>, Names)

#define ZARVO_FIELDS_Output_GetSubjectParamDetails(FIELD) \
  FIELD(float,      Value)                                \
  FIELD(float,      DefaultValue)                         \
  FIELD(SafeString, Unit)                                 \
  FIELD(bool,       Required)

#define ZARVO_FIELDS_Output_GetObject(FIELD) \
  FIELD(unsigned long long, ID)              \
  FIELD(SafeString,         Type)

#define ZARVO_FIELDS_Output_GetObjectList(FIELD)   \
  FIELD(std::vector<unsigned long long>, IDList)   \
  FIELD(std::vector<SafeString>,         TypeList)

#define ZARVO_FIELDS_Output_GetIntegerList(FIELD) \
  FIELD(std::vector<int>, Integers)

#define ZARVO_FIELDS_Output_GetString(FIELD) \
  FIELD(SafeString, Str)

#define ZARVO_FIELDS_Output_GetAttribute(FIELD) \
  FIELD(int,        Type)                       \
  FIELD(bool,       Editable)                   \
  FIELD(SafeString, Str)

#define ZARVO_FIELDS_Output_GetStringList(FIELD) \
  FIELD(std::vector<SafeString>, Strings)

#define ZARVO_FIELDS_Output_GetInteger(FIELD) \
  FIELD(int, Value)

#define ZARVO_FIELDS_Output_GetUnsignedLong(FIELD) \
  FIELD(unsigned long long, Value)

#define ZARVO_FIELDS_Output_GetUnsignedLongList(FIELD) \
  FIELD(std::vector<unsigned long long>, ValueList)

#define ZARVO_FIELDS_Output_GetFloat(FIELD) \
  FIELD(float, Value)

#define ZARVO_FIELDS_Output_GetTakeInfo(FIELD) \
  FIELD(SafeString, Name)                      \
  FIELD(SafeString, Desc)                      \
  FIELD(SafeString, Notes)

// ---- Processing settings ------------------------------------------------------------------------

#define ZARVO_FIELDS_Output_CircleFitSettings(FIELD) \
  FIELD(bool, Enabled,              true)            \
  FIELD(int,  NumThreads,           0, 0, 64)        \
  FIELD(bool, EnableVideoCentroids, false)
#define ZARVO_ORDER_Output_CircleFitSettings(ORDER)

// Distances in millimetres; the volume reaches 100 m either way from the origin.
#define ZARVO_FIELDS_Output_ReconstructSettings(FIELD)                      \
  FIELD(double,       EnvironmentalDriftTolerance, 1.5,    0,       10)     \
  FIELD(unsigned int, MinCamsToStartTrajectory,    3,      2,       16)     \
  FIELD(unsigned int, MinCamsToContinueTrajectory, 2,      2,       16)     \
  FIELD(double,       ReconMinSeparation,          14,     0,       1000)   \
  FIELD(double,       MinCentroidRadius,           0,      0,       50)     \
  FIELD(double,       MaxCentroidRadius,           50,     0,       1000)   \
  FIELD(double,       MinReconstructionRadius,     0,      0,       100)    \
  FIELD(double,       MaxReconstructionRadius,     1000,   0,       10000)  \
  FIELD(SafeString,   FitMethod,                   Fast,   "Fast|Accurate") \
  FIELD(double,       PredicationMatchFactor,      1,      0,       10)     \
  FIELD(unsigned int, MinTrajectoryLength,         2,      1,       1000)   \
  FIELD(double,       StartupError,                150,    0,       1000)   \
  FIELD(double,       PredicationError,            150,    0,       1000)   \
  FIELD(bool,         ComputeRadius,               true)                    \
  FIELD(double,       MinVolumeX,                  -10000, -100000, 100000) \
  FIELD(double,       MinVolumeY,                  -10000, -100000, 100000) \
  FIELD(double,       MinVolumeZ,                  -1000,  -100000, 100000) \
  FIELD(double,       MaxVolumeX,                  10000,  -100000, 100000) \
  FIELD(double,       MaxVolumeY,                  10000,  -100000, 100000) \
  FIELD(double,       MaxVolumeZ,                  5000,   -100000, 100000) \
  FIELD(int,          NumThreads,                  0,      0,       64)
#define ZARVO_ORDER_Output_ReconstructSettings(ORDER)          \
  ORDER(MinCamsToContinueTrajectory, MinCamsToStartTrajectory) \
  ORDER(MinCentroidRadius,           MaxCentroidRadius)        \
  ORDER(MinReconstructionRadius,     MaxReconstructionRadius)  \
  ORDER(MinVolumeX,                  MaxVolumeX)               \
  ORDER(MinVolumeY,                  MaxVolumeY)               \
  ORDER(MinVolumeZ,                  MaxVolumeZ)

#define ZARVO_FIELDS_Output_LabelingSettings(FIELD)              \
  FIELD(bool,   UseLabelingClusters,                true)        \
  FIELD(double, LabelCompletenessEntranceThreshold, 0.75, 0, 1)  \
  FIELD(bool,   UseRobustBooting,                   true)        \
  FIELD(double, BootingQuality,                     0.5,  0, 1)  \
  FIELD(double, BootingVersusTracking,              1,    0, 10) \
  FIELD(double, TrackingQuality,                    0.5,  0, 1)  \
  FIELD(double, SmoothingFactor,                    0.5,  0, 1)  \
  FIELD(bool,   SinglePassLabel,                    false)       \
  FIELD(int,    NumThreads,                         0,    0, 64)
#define ZARVO_ORDER_Output_LabelingSettings(ORDER)

#define ZARVO_FIELDS_Output_OcclusionFixingSettings(FIELD) \
  FIELD(bool,   Enabled,           true)                   \
  FIELD(bool,   ApplyFixedMarkers, true)                   \
  FIELD(double, MarkerSmoothing,   0,   0, 1)              \
  FIELD(double, DataFidelity,      1,   0, 1)              \
  FIELD(double, TransitionTime,    0.5, 0, 10)
#define ZARVO_ORDER_Output_OcclusionFixingSettings(ORDER)

#define ZARVO_FIELDS_Output_SolvingSettings(FIELD) \
  FIELD(double, PriorImportance,    1, 0, 100)     \
  FIELD(double, MeanPoseRatio,      1, 0, 10)      \
  FIELD(int,    NumThreads,         0, 0, 64)      \
  FIELD(bool,   ExtrapolateFingers, false)         \
  FIELD(double, FingerMultiplier,   1, 0, 10)
#define ZARVO_ORDER_Output_SolvingSettings(ORDER)

#define ZARVO_FIELDS_Output_LabelingSubjectCalibrationSettings(FIELD)   \
  FIELD(float,      RestImportance,          1,      0, 100)            \
  FIELD(float,      MarkerImportance,        1,      0, 100)            \
  FIELD(float,      SegmentImportance,       1,      0, 100)            \
  FIELD(SafeString, Quality,                 Medium, "Low|Medium|High") \
  FIELD(SafeString, StatsMode,               Full,   "Full|Basic")      \
  FIELD(SafeString, CalibrationMode,         Static, "Static|Dynamic")  \
  FIELD(int,        ActiveFrames,            200,    1, 100000)         \
  FIELD(bool,       AutoSaveZSK,             false)                     \
  FIELD(bool,       AutoSavePreCalHDF,       false)                     \
  FIELD(bool,       OverwriteRangeTemplates, false)                     \
  FIELD(bool,       ShowCovariance,          false)
#define ZARVO_ORDER_Output_LabelingSubjectCalibrationSettings(ORDER)

#define ZARVO_FIELDS_Output_LabelROMSettings(FIELD) \
  FIELD(float, StandardDeviation,  2,  0.1, 10)     \
  FIELD(float, SeparationDistance, 30, 0,   500)
#define ZARVO_ORDER_Output_LabelROMSettings(ORDER)

// ---- The records ----------------------------------------------------------------------------------

// The records derived from Output_Result that operations return, in declaration order.
#define ZARVO_PROTOCOL_RECORDS(X) \
  X(Output_ProcessRequest)        \
  X(Output_GetServerInfo)         \
  X(Output_GetCommandList)
#define ZARVO_QUERY_RECORDS(X)     \
  X(Output_GetSceneName)           \
  X(Output_GetSubjectNames)        \
  X(Output_GetMarkerNames)         \
  X(Output_HasTrajectory)          \
  X(Output_GetTrajectory)          \
  X(Output_GetTrajectoryAtFrame)   \
  X(Output_GetBoneNames)           \
  X(Output_GetRootBone)            \
  X(Output_GetBoneDetails)         \
  X(Output_GetConstraintNames)     \
  X(Output_GetConstraintDetails)   \
  X(Output_GetSubjectParamNames)   \
  X(Output_GetSubjectParamDetails) \
  X(Output_GetObject)              \
  X(Output_GetObjectList)          \
  X(Output_GetIntegerList)         \
  X(Output_GetString)              \
  X(Output_GetAttribute)           \
  X(Output_GetStringList)          \
  X(Output_GetInteger)             \
  X(Output_GetUnsignedLong)        \
  X(Output_GetUnsignedLongList)    \
  X(Output_GetFloat)               \
  X(Output_GetTakeInfo)
// Output_GetCommandInfo, which also has a member function, is declared between the two.
#define ZARVO_RESULT_RECORDS(X) ZARVO_PROTOCOL_RECORDS(X) X(Output_GetCommandInfo) ZARVO_QUERY_RECORDS(X)

// Records the library still declares from earlier versions; no operation returns them.
#define ZARVO_LEGACY_RECORDS(X) \
  X(Output_GetJointDetails)     \
  X(Output_GetJointNames)       \
  X(Output_GetRootSegment)      \
  X(Output_GetSegmentDetails)   \
  X(Output_GetSegmentNames)     \
  X(Output_GetTrialName)

// The processing settings, which scripts also create.
#define ZARVO_SETTINGS_RECORDS(X)              \
  X(Output_CircleFitSettings)                  \
  X(Output_ReconstructSettings)                \
  X(Output_LabelingSettings)                   \
  X(Output_OcclusionFixingSettings)            \
  X(Output_SolvingSettings)                    \
  X(Output_LabelingSubjectCalibrationSettings) \
  X(Output_LabelROMSettings)
