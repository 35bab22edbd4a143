// One operation of the client as one request: its arguments are written as the command's inputs,
// and the reply's outputs are read into the fields of the result record, both in the order the
// command's declaration gives. The declaration and the C++ types are checked against each other at
// compile time.
#pragma once

#include <charconv>
#include <cstdlib>
#include <string>
#include <tuple>
#include <type_traits>
#include <utility>
#include <vector>

#include "library/Connection.h"
#include "protocol/catalogue.h"
#include "protocol/wire.h"

namespace ZarvoSDKClientCPP {

namespace request {

using client3::protocol::CommandOf;
using client3::protocol::DecodeError;
using client3::protocol::Id;
using client3::protocol::Reader;
using client3::protocol::Type;
using client3::protocol::Writer;

// The fields of each record that a reply fills, in declaration order.
template <class R>
inline constexpr auto FieldsOf = std::tuple<>{};
#define CLIENT3_FIELDS(R, ...) \
  template <>                  \
  inline constexpr auto FieldsOf<R> = std::tuple{__VA_ARGS__};
#define F(R, name) &R::name
CLIENT3_FIELDS(Output_GetServerInfo, F(Output_GetServerInfo, Program), F(Output_GetServerInfo, MajorVersion),
               F(Output_GetServerInfo, MinorVersion), F(Output_GetServerInfo, PointVersion),
               F(Output_GetServerInfo, ReleaseType))
CLIENT3_FIELDS(Output_ProcessRequest, F(Output_ProcessRequest, OutputParameters))
CLIENT3_FIELDS(Output_GetCommandList, F(Output_GetCommandList, Commands))
CLIENT3_FIELDS(Output_GetCommandInfo, F(Output_GetCommandInfo, Name), F(Output_GetCommandInfo, Description),
               F(Output_GetCommandInfo, InputParameters), F(Output_GetCommandInfo, OutputParameters))
CLIENT3_FIELDS(Output_GetSceneName, F(Output_GetSceneName, Name), F(Output_GetSceneName, Path))
CLIENT3_FIELDS(Output_GetSubjectNames, F(Output_GetSubjectNames, Names), F(Output_GetSubjectNames, Models),
               F(Output_GetSubjectNames, Active))
CLIENT3_FIELDS(Output_GetMarkerNames, F(Output_GetMarkerNames, Names))
CLIENT3_FIELDS(Output_GetTrajectory, F(Output_GetTrajectory, X), F(Output_GetTrajectory, Y), F(Output_GetTrajectory, Z),
               F(Output_GetTrajectory, E))
CLIENT3_FIELDS(Output_GetBoneNames, F(Output_GetBoneNames, Names))
CLIENT3_FIELDS(Output_GetRootBone, F(Output_GetRootBone, Name))
CLIENT3_FIELDS(Output_GetBoneDetails, F(Output_GetBoneDetails, Parent), F(Output_GetBoneDetails, Children))
CLIENT3_FIELDS(Output_GetConstraintNames, F(Output_GetConstraintNames, Names))
CLIENT3_FIELDS(Output_GetConstraintDetails, F(Output_GetConstraintDetails, Active), F(Output_GetConstraintDetails, Source),
               F(Output_GetConstraintDetails, Target), F(Output_GetConstraintDetails, Offset),
               F(Output_GetConstraintDetails, Type))
CLIENT3_FIELDS(Output_GetSubjectParamNames, F(Output_GetSubjectParamNames, Names))
CLIENT3_FIELDS(Output_GetSubjectParamDetails, F(Output_GetSubjectParamDetails, Value),
               F(Output_GetSubjectParamDetails, DefaultValue), F(Output_GetSubjectParamDetails, Unit),
               F(Output_GetSubjectParamDetails, Required))
CLIENT3_FIELDS(Output_GetObject, F(Output_GetObject, ID), F(Output_GetObject, Type))
CLIENT3_FIELDS(Output_GetObjectList, F(Output_GetObjectList, IDList), F(Output_GetObjectList, TypeList))
CLIENT3_FIELDS(Output_GetIntegerList, F(Output_GetIntegerList, Integers))
CLIENT3_FIELDS(Output_GetString, F(Output_GetString, Str))
CLIENT3_FIELDS(Output_GetAttribute, F(Output_GetAttribute, Type), F(Output_GetAttribute, Editable), F(Output_GetAttribute, Str))
CLIENT3_FIELDS(Output_GetStringList, F(Output_GetStringList, Strings))
CLIENT3_FIELDS(Output_GetInteger, F(Output_GetInteger, Value))
CLIENT3_FIELDS(Output_GetUnsignedLong, F(Output_GetUnsignedLong, Value))
CLIENT3_FIELDS(Output_GetUnsignedLongList, F(Output_GetUnsignedLongList, ValueList))
CLIENT3_FIELDS(Output_GetFloat, F(Output_GetFloat, Value))
CLIENT3_FIELDS(Output_CircleFitSettings, F(Output_CircleFitSettings, Enabled), F(Output_CircleFitSettings, NumThreads),
               F(Output_CircleFitSettings, EnableVideoCentroids))
CLIENT3_FIELDS(Output_ReconstructSettings, F(Output_ReconstructSettings, EnvironmentalDriftTolerance),
               F(Output_ReconstructSettings, MinCamsToStartTrajectory), F(Output_ReconstructSettings, MinCamsToContinueTrajectory),
               F(Output_ReconstructSettings, ReconMinSeparation), F(Output_ReconstructSettings, MinCentroidRadius),
               F(Output_ReconstructSettings, MaxCentroidRadius), F(Output_ReconstructSettings, MinReconstructionRadius),
               F(Output_ReconstructSettings, MaxReconstructionRadius), F(Output_ReconstructSettings, FitMethod),
               F(Output_ReconstructSettings, PredicationMatchFactor), F(Output_ReconstructSettings, MinTrajectoryLength),
               F(Output_ReconstructSettings, StartupError), F(Output_ReconstructSettings, PredicationError),
               F(Output_ReconstructSettings, ComputeRadius), F(Output_ReconstructSettings, MinVolumeX),
               F(Output_ReconstructSettings, MinVolumeY), F(Output_ReconstructSettings, MinVolumeZ),
               F(Output_ReconstructSettings, MaxVolumeX), F(Output_ReconstructSettings, MaxVolumeY),
               F(Output_ReconstructSettings, MaxVolumeZ), F(Output_ReconstructSettings, NumThreads))
CLIENT3_FIELDS(Output_LabelROMSettings, F(Output_LabelROMSettings, StandardDeviation),
               F(Output_LabelROMSettings, SeparationDistance))
CLIENT3_FIELDS(Output_LabelingSettings, F(Output_LabelingSettings, UseLabelingClusters),
               F(Output_LabelingSettings, LabelCompletenessEntranceThreshold), F(Output_LabelingSettings, UseRobustBooting),
               F(Output_LabelingSettings, BootingQuality), F(Output_LabelingSettings, BootingVersusTracking),
               F(Output_LabelingSettings, TrackingQuality), F(Output_LabelingSettings, SmoothingFactor),
               F(Output_LabelingSettings, SinglePassLabel), F(Output_LabelingSettings, NumThreads))
CLIENT3_FIELDS(Output_LabelingSubjectCalibrationSettings, F(Output_LabelingSubjectCalibrationSettings, RestImportance),
               F(Output_LabelingSubjectCalibrationSettings, MarkerImportance),
               F(Output_LabelingSubjectCalibrationSettings, SegmentImportance),
               F(Output_LabelingSubjectCalibrationSettings, Quality), F(Output_LabelingSubjectCalibrationSettings, StatsMode),
               F(Output_LabelingSubjectCalibrationSettings, CalibrationMode),
               F(Output_LabelingSubjectCalibrationSettings, ActiveFrames),
               F(Output_LabelingSubjectCalibrationSettings, AutoSaveZSK),
               F(Output_LabelingSubjectCalibrationSettings, AutoSavePreCalHDF),
               F(Output_LabelingSubjectCalibrationSettings, OverwriteRangeTemplates),
               F(Output_LabelingSubjectCalibrationSettings, ShowCovariance))
CLIENT3_FIELDS(Output_OcclusionFixingSettings, F(Output_OcclusionFixingSettings, Enabled),
               F(Output_OcclusionFixingSettings, ApplyFixedMarkers), F(Output_OcclusionFixingSettings, MarkerSmoothing),
               F(Output_OcclusionFixingSettings, DataFidelity), F(Output_OcclusionFixingSettings, TransitionTime))
CLIENT3_FIELDS(Output_SolvingSettings, F(Output_SolvingSettings, PriorImportance), F(Output_SolvingSettings, MeanPoseRatio),
               F(Output_SolvingSettings, NumThreads), F(Output_SolvingSettings, ExtrapolateFingers),
               F(Output_SolvingSettings, FingerMultiplier))
#undef F
#undef CLIENT3_FIELDS

// ---- Types on the wire ------------------------------------------------------------------------

template <class T>
struct WireOf;
template <> struct WireOf<SafeString> { static constexpr Type value = Type::String; };
template <> struct WireOf<int> { static constexpr Type value = Type::Int; };
template <> struct WireOf<unsigned int> { static constexpr Type value = Type::UInt; };
template <> struct WireOf<unsigned long long> { static constexpr Type value = Type::ULong; };
template <> struct WireOf<bool> { static constexpr Type value = Type::Bool; };
template <> struct WireOf<float> { static constexpr Type value = Type::Float; };
template <> struct WireOf<double> { static constexpr Type value = Type::Double; };
template <> struct WireOf<std::vector<SafeString>> { static constexpr Type value = Type::Strings; };
template <> struct WireOf<std::vector<bool>> { static constexpr Type value = Type::Bools; };
template <> struct WireOf<std::vector<float>> { static constexpr Type value = Type::Floats; };
template <> struct WireOf<std::vector<double>> { static constexpr Type value = Type::Doubles; };
template <> struct WireOf<std::vector<int>> { static constexpr Type value = Type::Ints; };
template <> struct WireOf<std::vector<unsigned long long>> { static constexpr Type value = Type::ULongs; };
template <> struct WireOf<std::vector<Type_Parameter>> { static constexpr Type value = Type::Params; };

template <class M>
struct FieldType;
template <class C, class T>
struct FieldType<T C::*> : std::type_identity<T> {};

template <class Tuple, std::size_t... I>
constexpr bool FieldsMatch(std::span<const client3::protocol::Param> params, const Tuple&, std::index_sequence<I...>) {
  return params.size() == sizeof...(I) &&
         ((params[I].type == WireOf<typename FieldType<std::tuple_element_t<I, Tuple>>::type>::value) && ...);
}
// Whether a command's outputs are the fields of R, in order and type.
template <Id C, class R>
constexpr bool OutputsAre() {
  constexpr auto fields = FieldsOf<R>;
  return FieldsMatch(CommandOf(C).out, fields, std::make_index_sequence<std::tuple_size_v<decltype(fields)>>{});
}
template <Id C, class... A, std::size_t... I>
constexpr bool InputsAre(std::index_sequence<I...>) {
  return CommandOf(C).in.size() == sizeof...(A) && ((CommandOf(C).in[I].type == WireOf<A>::value) && ...);
}

// ---- Writing arguments ------------------------------------------------------------------------

inline void Put(Writer& w, SafeString const& text) { w.Put(text.Text()); }
inline void Put(Writer& w, int v) { w.Put(static_cast<std::int32_t>(v)); }
inline void Put(Writer& w, unsigned int v) { w.Put(static_cast<std::uint32_t>(v)); }
inline void Put(Writer& w, unsigned long long v) { w.Put(static_cast<std::uint64_t>(v)); }
inline void Put(Writer& w, bool v) { w.Put(v); }
inline void Put(Writer& w, float v) { w.Put(v); }
inline void Put(Writer& w, double v) { w.Put(v); }
inline void Put(Writer& w, std::vector<double> const& v) { w.Put(v); }
inline void Put(Writer& w, std::vector<bool> const& v) { w.Put(v); }
inline void Put(Writer& w, std::vector<Type_Parameter> const& v) {
  w.PutPairs(v, [](Type_Parameter const& p) {
    return std::pair<std::string_view, std::string_view>(p.Name.Text() ? p.Name.Text() : "", p.Value.Text() ? p.Value.Text() : "");
  });
}

// ---- Reading outputs --------------------------------------------------------------------------

// Thrown when a value that should be a number came as a text that is not one.
struct NotNumeric {};

// Gives `target` its own copy of `text`: one duplication, where assigning a new SafeString makes two.
inline void Own(SafeString& target, char const* text) {
  SafeString made(VStringFactory::Instance(), text);
  std::swap(target.OwnedText, made.OwnedText);
  std::swap(target.ViewText, made.ViewText);
  std::swap(target.Factory, made.Factory);
}
inline void Own(SafeString& target, std::string_view text) { Own(target, std::string(text).c_str()); }

// A number, also accepted as its text.
template <class T>
T Number(Reader& r) {
  if (r.Peek() != Type::String) {
    if constexpr (std::is_same_v<T, int>) return r.Get<std::int32_t>();
    else if constexpr (std::is_same_v<T, unsigned int>) return r.Get<std::uint32_t>();
    else if constexpr (std::is_same_v<T, unsigned long long>) return r.Get<std::uint64_t>();
    else return r.Get<T>();
  }
  std::string_view text = r.Text();
  T value{};
  if constexpr (std::is_same_v<T, bool>) {
    if (text == "true" || text == "1") return true;
    if (text == "false" || text == "0") return false;
    throw NotNumeric{};
  } else {
    auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
    if (error != std::errc() || end != text.data() + text.size()) throw NotNumeric{};
    return value;
  }
}

template <class T>
void Read(Reader& r, T& out) {
  if constexpr (std::is_arithmetic_v<T>) {
    out = Number<T>(r);
  } else if constexpr (std::is_same_v<T, SafeString>) {
    Own(out, r.Text());
  } else if constexpr (std::is_same_v<T, std::vector<SafeString>>) {
    out.clear();
    r.GetTexts([&](std::string_view text) { Own(out.emplace_back(), text); });
  } else if constexpr (std::is_same_v<T, std::vector<Type_Parameter>>) {
    out.clear();
    r.GetPairs([&](std::string_view name, std::string_view value) {
      Type_Parameter& parameter = out.emplace_back();
      Own(parameter.Name, name);
      Own(parameter.Value, value);
    });
  } else if constexpr (std::is_same_v<T, std::vector<int>>) {
    std::vector<std::int32_t> values;
    r.Get(values);
    out.assign(values.begin(), values.end());
  } else if constexpr (std::is_same_v<T, std::vector<unsigned long long>>) {
    std::vector<std::uint64_t> values;
    r.Get(values);
    out.assign(values.begin(), values.end());
  } else {
    r.Get(out);
  }
}

// Reads every field of `record` that FieldsOf<R> lists.
template <class R>
void ReadFields(Reader& r, R& record) {
  std::apply([&](auto... field) { (Read(r, record.*field), ...); }, FieldsOf<R>);
  if (!r.done()) throw DecodeError("the reply has more values than the command gives");
}

// Sets the result code and its text: the application's message when it sent one (why it refused a
// command, or what a stage or filter did), else the code's own.
inline void SetResult(Output_Result& record, ResultCode::Enum code, std::string const& message) {
  record.Result = code;
  Own(record.ResultString, message.empty() ? ResultText(code) : message.c_str());
}

// Sends command C with `args` and reads the reply with `read(reader, record)` into a record R.
template <Id C, class R, class Read, class... A>
R Exchange(ClientConnection* connection, Read read, A const&... args) {
  static_assert(InputsAre<C, A...>(std::index_sequence_for<A...>{}), "the arguments are not the command's inputs");
  R record{};
  std::string message;
  ResultCode::Enum code = ResultCode::NotConnected;
  if (connection) {
    auto call = connection->Start(C);
    if (call.Begin()) {
      (Put(call.request(), args), ...);
      code = call.Exchange(message);
    }
    if (code == ResultCode::Success) {
      try {
        Reader outputs = call.outputs();
        read(outputs, record);
      } catch (const DecodeError&) {
        record = R{};
        code = ResultCode::ReplyParsingError;
        message.clear();
      } catch (const NotNumeric&) {
        record = R{};
        code = ResultCode::ConversionError;
        message.clear();
      }
    }
  }
  SetResult(record, code, message);
  return record;
}

// The common case: the command's outputs are the record's fields.
template <Id C, class R, class... A>
R Ask(ClientConnection* connection, A const&... args) {
  static_assert(OutputsAre<C, R>(), "the command's outputs are not the record's fields");
  return Exchange<C, R>(connection, [](Reader& r, R& record) { ReadFields(r, record); }, args...);
}

}  // namespace request

}  // namespace ZarvoSDKClientCPP
