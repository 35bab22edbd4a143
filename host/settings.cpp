// The settings records: their defaults and ranges, and the commands that read and replace them.
#include "host/settings.h"

#include <cmath>
#include <algorithm>
#include <cstdlib>
#include <optional>
#include <span>

#include "host/handlers.h"
#include "host/text.h"

namespace client3::host {

using protocol::Id;
using protocol::Reader;
using protocol::Type;
using protocol::Writer;

namespace {

// A field's default and what it may hold: numbers from `least` to `most`, or one of the words in
// `words` ("A|B|C"); booleans may hold either value.
struct FieldRule {
  std::string_view name, fallback;
  double least = 0, most = 0;
  std::string_view words = {};
};

// Two fields of one record where the first may not exceed the second.
struct OrderRule {
  std::string_view low, high;
};

struct RecordRule {
  std::string_view name;
  Id get, set;
  std::span<const FieldRule> fields;
  std::span<const OrderRule> order;
};

constexpr double kVolume = 100'000;  // millimetres either way from the origin

constexpr FieldRule kCircleFit[] = {
    {"Enabled", "true"}, {"NumThreads", "0", 0, 64}, {"EnableVideoCentroids", "false"},
};
constexpr FieldRule kReconstruct[] = {
    {"EnvironmentalDriftTolerance", "1.5", 0, 10},
    {"MinCamsToStartTrajectory", "3", 2, 16},
    {"MinCamsToContinueTrajectory", "2", 2, 16},
    {"ReconMinSeparation", "14", 0, 1000},
    {"MinCentroidRadius", "0", 0, 50},
    {"MaxCentroidRadius", "50", 0, 1000},
    {"MinReconstructionRadius", "0", 0, 100},
    {"MaxReconstructionRadius", "1000", 0, 10000},
    {"FitMethod", "Fast", 0, 0, "Fast|Accurate"},
    {"PredicationMatchFactor", "1", 0, 10},
    {"MinTrajectoryLength", "2", 1, 1000},
    {"StartupError", "150", 0, 1000},
    {"PredicationError", "150", 0, 1000},
    {"ComputeRadius", "true"},
    {"MinVolumeX", "-10000", -kVolume, kVolume},
    {"MinVolumeY", "-10000", -kVolume, kVolume},
    {"MinVolumeZ", "-1000", -kVolume, kVolume},
    {"MaxVolumeX", "10000", -kVolume, kVolume},
    {"MaxVolumeY", "10000", -kVolume, kVolume},
    {"MaxVolumeZ", "5000", -kVolume, kVolume},
    {"NumThreads", "0", 0, 64},
};
constexpr OrderRule kReconstructOrder[] = {
    {"MinCamsToContinueTrajectory", "MinCamsToStartTrajectory"},
    {"MinCentroidRadius", "MaxCentroidRadius"},
    {"MinReconstructionRadius", "MaxReconstructionRadius"},
    {"MinVolumeX", "MaxVolumeX"},
    {"MinVolumeY", "MaxVolumeY"},
    {"MinVolumeZ", "MaxVolumeZ"},
};
constexpr FieldRule kLabelROM[] = {
    {"StandardDeviation", "2", 0.1, 10}, {"SeparationDistance", "30", 0, 500},
};
constexpr FieldRule kLabeling[] = {
    {"UseLabelingClusters", "true"},
    {"LabelCompletenessEntranceThreshold", "0.75", 0, 1},
    {"UseRobustBooting", "true"},
    {"BootingQuality", "0.5", 0, 1},
    {"BootingVersusTracking", "1", 0, 10},
    {"TrackingQuality", "0.5", 0, 1},
    {"SmoothingFactor", "0.5", 0, 1},
    {"SinglePassLabel", "false"},
    {"NumThreads", "0", 0, 64},
};
constexpr FieldRule kLabelingSubjectCalibration[] = {
    {"RestImportance", "1", 0, 100},
    {"MarkerImportance", "1", 0, 100},
    {"SegmentImportance", "1", 0, 100},
    {"Quality", "Medium", 0, 0, "Low|Medium|High"},
    {"StatsMode", "Full", 0, 0, "Full|Basic"},
    {"CalibrationMode", "Static", 0, 0, "Static|Dynamic"},
    {"ActiveFrames", "200", 1, 100000},
    {"AutoSaveZSK", "false"},
    {"AutoSavePreCalHDF", "false"},
    {"OverwriteRangeTemplates", "false"},
    {"ShowCovariance", "false"},
};
constexpr FieldRule kOcclusionFixing[] = {
    {"Enabled", "true"},
    {"ApplyFixedMarkers", "true"},
    {"MarkerSmoothing", "0", 0, 1},
    {"DataFidelity", "1", 0, 1},
    {"TransitionTime", "0.5", 0, 10},
};
constexpr FieldRule kSolving[] = {
    {"PriorImportance", "1", 0, 100},
    {"MeanPoseRatio", "1", 0, 10},
    {"NumThreads", "0", 0, 64},
    {"ExtrapolateFingers", "false"},
    {"FingerMultiplier", "1", 0, 10},
};

const RecordRule kRecords[kRecordCount] = {
    {"CircleFit", Id::OfflineGetCircleFitSettings, Id::OfflineSetCircleFitSettings, kCircleFit, {}},
    {"Reconstruct", Id::OfflineGetReconstructSettings, Id::OfflineSetReconstructSettings, kReconstruct, kReconstructOrder},
    {"LabelROM", Id::OfflineGetLabelROMSettings, Id::OfflineSetLabelROMSettings, kLabelROM, {}},
    {"Labeling", Id::OfflineGetLabelingSettings, Id::OfflineSetLabelingSettings, kLabeling, {}},
    {"LabelingSubjectCalibration", Id::OfflineGetLabelingSubjectCalibrationSettings,
     Id::OfflineSetLabelingSubjectCalibrationSettings, kLabelingSubjectCalibration, {}},
    {"OcclusionFixing", Id::OfflineGetOcclusionFixingSettings, Id::OfflineSetOcclusionFixingSettings, kOcclusionFixing, {}},
    {"Solving", Id::OfflineGetSolvingSettings, Id::OfflineSetSolvingSettings, kSolving, {}},
};

const RecordRule& RuleOf(Record record) { return kRecords[static_cast<std::size_t>(record)]; }

// The rules must name the catalogue's fields in its order; a mismatch is a fault of this program.
const RecordRule& Checked(Record record) {
  static const bool checked = [] {
    for (const RecordRule& rule : kRecords) {
      auto declared = protocol::CommandOf(rule.get).out;
      bool same = declared.size() == rule.fields.size();
      for (std::size_t i = 0; same && i < declared.size(); ++i) same = declared[i].name == rule.fields[i].name;
      if (!same) LogLine("error", "the settings rules of '" + std::string(rule.name) + "' do not match the catalogue"), std::abort();
    }
    return true;
  }();
  (void)checked;
  return RuleOf(record);
}

std::size_t FieldIndex(Record record, std::string_view field) {
  const RecordRule& rule = Checked(record);
  for (std::size_t i = 0; i < rule.fields.size(); ++i)
    if (rule.fields[i].name == field) return i;
  LogLine("error", "no settings field '" + std::string(field) + "' in '" + std::string(rule.name) + "'");
  std::abort();
}

std::string Plain(double v) {
  return v == std::floor(v) ? std::to_string(static_cast<long long>(v)) : NumberText(v);
}

std::string RangeText(const FieldRule& f) {
  if (!f.words.empty()) {
    std::string words(f.words);
    for (char& c : words)
      if (c == '|') c = ',';
    return "one of " + words;
  }
  return "from " + Plain(f.least) + " to " + Plain(f.most);
}

// Why `texts` is not a valid value of the record; empty when it is. The texts are canonical.
std::string Problem(const RecordRule& rule, const std::vector<std::string>& texts) {
  auto declared = protocol::CommandOf(rule.get).out;
  for (std::size_t i = 0; i < rule.fields.size(); ++i) {
    const FieldRule& f = rule.fields[i];
    const std::string& text = texts[i];
    std::string what = std::string(rule.name) + " setting '" + std::string(f.name) + "' must be " + RangeText(f) + ", not '" + text + "'";
    if (declared[i].type == Type::Bool) continue;
    if (declared[i].type == Type::String) {
      bool allowed = false;
      for (std::size_t from = 0; from <= f.words.size() && !allowed;) {
        std::size_t bar = std::min(f.words.find('|', from), f.words.size());
        allowed = f.words.substr(from, bar - from) == text;
        from = bar + 1;
      }
      if (!allowed) return what;
      continue;
    }
    std::optional<double> v = ParseDouble(text);
    if (!v || !(*v >= f.least && *v <= f.most)) return what;
  }
  for (const OrderRule& o : rule.order) {
    std::size_t low = 0, high = 0;
    for (std::size_t i = 0; i < rule.fields.size(); ++i) {
      if (rule.fields[i].name == o.low) low = i;
      if (rule.fields[i].name == o.high) high = i;
    }
    if (*ParseDouble(texts[low]) > *ParseDouble(texts[high]))
      return std::string(rule.name) + " setting '" + std::string(o.low) + "' (" + texts[low] + ") cannot exceed '" + std::string(o.high) +
             "' (" + texts[high] + ")";
  }
  return {};
}

template <Record R>
void Get(Context& context, Reader&, Writer& out) {
  const RecordRule& rule = Checked(R);
  auto declared = protocol::CommandOf(rule.get).out;
  const std::vector<std::string>& values = context.scene.settings.values[static_cast<std::size_t>(R)];
  for (std::size_t i = 0; i < declared.size(); ++i) FromText(values[i], declared[i].type, out);
}

template <Record R>
void Set(Context& context, Reader& in, Writer&) {
  const RecordRule& rule = Checked(R);
  std::vector<std::string> texts;
  for (const protocol::Param& p : protocol::CommandOf(rule.set).in) {
    std::string text = ToText(in, p.type);
    // Text fields travel as they are; ToText escapes list separators that a single word keeps.
    if (p.type == Type::String) {
      std::string plain;
      for (std::size_t i = 0; i < text.size(); ++i) plain += text[i] == '\\' && i + 1 < text.size() ? text[++i] : text[i];
      text = plain;
    }
    texts.push_back(std::move(text));
  }
  if (std::string why = Problem(rule, texts); !why.empty()) Refuse(why);
  context.scene.settings.values[static_cast<std::size_t>(R)] = std::move(texts);
  LogLine("info", "settings " + std::string(rule.name) + " set: " + context.scene.settings.Summary(R));
}

#define CLIENT3_SETTINGS(record)                                                   \
  {Id::OfflineGet##record##Settings, &Get<Record::record>, Access::Read}, {Id::OfflineSet##record##Settings, &Set<Record::record>}
constexpr HandlerEntry kHandlers[] = {
    CLIENT3_SETTINGS(CircleFit),        CLIENT3_SETTINGS(Reconstruct),     CLIENT3_SETTINGS(LabelROM),
    CLIENT3_SETTINGS(Labeling),         CLIENT3_SETTINGS(LabelingSubjectCalibration),
    CLIENT3_SETTINGS(OcclusionFixing),  CLIENT3_SETTINGS(Solving),
};
#undef CLIENT3_SETTINGS

}  // namespace

Settings::Settings() {
  for (std::size_t r = 0; r < kRecordCount; ++r)
    for (const FieldRule& f : kRecords[r].fields) values[r].emplace_back(f.fallback);
}

double Settings::Number(Record record, std::string_view field) const {
  return ParseDouble(Text(record, field)).value_or(0);
}

bool Settings::Flag(Record record, std::string_view field) const { return Text(record, field) == "true"; }

const std::string& Settings::Text(Record record, std::string_view field) const {
  return values[static_cast<std::size_t>(record)][FieldIndex(record, field)];
}

std::string Settings::Summary(Record record) const {
  const RecordRule& rule = Checked(record);
  std::string out;
  for (std::size_t i = 0; i < rule.fields.size(); ++i)
    out.append(i ? "," : "").append(rule.fields[i].name).append("=").append(values[static_cast<std::size_t>(record)][i]);
  return out;
}

std::string_view RecordName(Record record) { return RuleOf(record).name; }

std::string SetRecordFromText(Settings& settings, std::string_view name, const std::vector<std::string>& texts) {
  for (std::size_t r = 0; r < kRecordCount; ++r) {
    const RecordRule& rule = Checked(static_cast<Record>(r));
    if (rule.name != name) continue;
    auto declared = protocol::CommandOf(rule.get).out;
    if (texts.size() != declared.size()) return "the " + std::string(name) + " settings need " + std::to_string(declared.size()) + " values";
    std::vector<std::string> canonical;
    for (std::size_t i = 0; i < texts.size(); ++i) {
      if (declared[i].type == Type::String) {
        canonical.push_back(texts[i]);
        continue;
      }
      Writer w;
      if (!FromText(texts[i], declared[i].type, w)) return "a bad value of " + std::string(name) + " setting '" + std::string(declared[i].name) + "'";
      Reader back(w.Finish().substr(protocol::kHeaderSize));
      canonical.push_back(ToText(back, declared[i].type));
    }
    if (std::string why = Problem(rule, canonical); !why.empty()) return why;
    settings.values[r] = std::move(canonical);
    return {};
  }
  return "no settings named '" + std::string(name) + "'";
}

std::span<const HandlerEntry> SettingsHandlers() { return kHandlers; }

}  // namespace client3::host
