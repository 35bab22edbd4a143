// The handlers of the application's commands. A handler is a specialisation of Handle<Id>; commands
// without one are answered by the primary template, which refuses them as not available.
#include "host/commands.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdio>
#include <ctime>
#include <optional>
#include <unordered_map>

#include "host/text.h"
#include "platform/net.h"

namespace client3::host {

using protocol::CommandOf;
using protocol::Id;
using protocol::Reader;
using protocol::Type;
using protocol::Writer;

void Refuse(std::string message) { throw Failure{Refused, std::move(message)}; }

void LogLine(std::string_view level, std::string_view message) {
  std::string line;
  for (char c : message) {
    if (c == '\n') line += "\\n";
    else if (c == '\r') line += "\\r";
    else if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f) line += '?';
    else line += c;
  }
  std::tm local = platform::LocalTime(std::chrono::system_clock::to_time_t(std::chrono::system_clock::now()));
  char stamp[32];
  std::strftime(stamp, sizeof stamp, "%Y-%m-%d %H:%M:%S", &local);
  std::fprintf(stderr, "%s %.*s %s\n", stamp, static_cast<int>(level.size()), level.data(), line.c_str());
  std::fflush(stderr);
}

namespace {

// ---- Lookups that refuse with a message naming what is missing ---------------------------------

Subject& SubjectOf(Scene& scene, std::string_view name) {
  if (Subject* s = scene.FindSubject(name)) return *s;
  Refuse("no subject named '" + std::string(name) + "'");
}

// A subject's skeleton: named after its model; an empty name means the subject's own.
Subject& SkeletonOf(Scene& scene, std::string_view subject, std::string_view skeleton) {
  Subject& s = SubjectOf(scene, subject);
  if (!skeleton.empty() && skeleton != s.model)
    Refuse("subject '" + s.name + "' has no skeleton named '" + std::string(skeleton) + "'");
  return s;
}

template <class T>
T& Named(std::vector<T>& list, std::string_view name, std::string_view what, const Subject& owner) {
  if (T* item = FindNamed(list, name)) return *item;
  Refuse("subject '" + owner.name + "' has no " + std::string(what) + " named '" + std::string(name) + "'");
}

template <class T>
std::vector<std::string> NamesOf(const std::vector<T>& list) {
  std::vector<std::string> names;
  for (const T& item : list) names.push_back(item.name);
  return names;
}

// A frame number as an index into the take's arrays.
std::size_t FrameIndex(const Scene& scene, int frame) {
  if (frame < 1 || frame > scene.frames)
    throw Failure{BadFrame, "frame " + std::to_string(frame) + " is outside the take (1 to " + std::to_string(scene.frames) + ")"};
  return static_cast<std::size_t>(frame - 1);
}

std::optional<Id> CommandNamed(std::string_view name) {
  static const auto byName = [] {
    std::unordered_map<std::string_view, Id> map;
    for (std::size_t i = 0; i < protocol::kCommandCount; ++i) map.emplace(protocol::kCommands[i].name, static_cast<Id>(i));
    return map;
  }();
  auto found = byName.find(name);
  if (found == byName.end()) return std::nullopt;
  return found->second;
}

const std::array<std::string_view, 6> kLanguages = {"en", "de", "fr", "es", "ja", "zh"};
const std::array<std::string_view, 4> kLevels = {"debug", "info", "warning", "error"};

// Runs a command whose inputs are given as name and text pairs; `used` receives every input as it
// was used (defaults filled in) and `outputs` the outputs, both as text.
void RunByName(Context& context, std::string_view name, const protocol::NameValues& given,
               protocol::NameValues& used, protocol::NameValues& outputs) {
  std::optional<Id> id = CommandNamed(name);
  if (!id) Refuse("no command named '" + std::string(name) + "'");
  if (*id == Id::ProcessRequest || *id == Id::PSL) Refuse("'" + std::string(name) + "' cannot be run by name");
  const protocol::Command& command = CommandOf(*id);
  for (const protocol::NameValue& p : given) {
    auto declared = [&](const protocol::Param& d) { return d.name == p.name; };
    if (std::none_of(command.in.begin(), command.in.end(), declared) &&
        std::none_of(command.out.begin(), command.out.end(), declared))
      Refuse("'" + std::string(name) + "' has no parameter named '" + p.name + "'");
  }
  Writer inputs;
  for (const protocol::Param& d : command.in) {
    auto value = std::find_if(given.begin(), given.end(), [&](const protocol::NameValue& p) { return p.name == d.name; });
    std::string_view text = value == given.end() ? d.fallback : std::string_view(value->value);
    if (!FromText(text, d.type, inputs))
      Refuse("parameter '" + std::string(d.name) + "' of '" + std::string(name) + "' is not a " + std::string(TypeName(d.type)) + ": '" + std::string(text) + "'");
    used.push_back({std::string(d.name), std::string(text)});
  }
  std::string_view body = inputs.Finish().substr(protocol::kHeaderSize);
  Reader in(body);
  Writer out;
  Run(*id, context, in, out);
  Reader results(out.Finish().substr(protocol::kHeaderSize));
  for (const protocol::Param& d : command.out) outputs.push_back({std::string(d.name), ToText(results, d.type)});
}

// Splits a command line into words: blanks separate them, double quotes group them, and a
// backslash inside quotes takes the next character as it is.
std::vector<std::string> Words(std::string_view line) {
  std::vector<std::string> words;
  std::string word;
  bool quoted = false, any = false;
  for (std::size_t i = 0; i < line.size(); ++i) {
    char c = line[i];
    if (quoted && c == '\\' && i + 1 < line.size()) {
      word += line[++i];
    } else if (c == '"') {
      quoted = !quoted, any = true;
    } else if (!quoted && (c == ' ' || c == '\t')) {
      if (any) words.push_back(std::move(word)), word.clear(), any = false;
    } else {
      word += c, any = true;
    }
  }
  if (quoted) Refuse("the command line has an unterminated quote");
  if (any) words.push_back(std::move(word));
  return words;
}

// ---- The handlers -------------------------------------------------------------------------------

template <Id C>
void Handle(Context&, Reader&, Writer&) {
  Refuse("'" + std::string(CommandOf(C).name) + "' is not available in this version of the application");
}

template <>
void Handle<Id::GetServerInfo>(Context&, Reader&, Writer& out) {
  out.Put("Pellux Post");
  out.Put(std::uint32_t{1}), out.Put(std::uint32_t{0}), out.Put(std::uint32_t{0});
  out.Put("Release");
}

template <>
void Handle<Id::GetCommandList>(Context&, Reader&, Writer& out) {
  out.PutTexts(protocol::kCommands, [](const protocol::Command& c) { return c.name; });
}

template <>
void Handle<Id::GetCommandInfo>(Context&, Reader& in, Writer& out) {
  std::string_view name = in.Text();
  std::optional<Id> id = CommandNamed(name);
  if (!id) Refuse("no command named '" + std::string(name) + "'");
  const protocol::Command& command = CommandOf(*id);
  out.Put(command.name);
  out.Put(command.description);
  using Pair = std::pair<std::string_view, std::string_view>;
  out.PutPairs(command.in, [](const protocol::Param& p) { return Pair(p.name, p.fallback); });
  out.PutPairs(command.out, [](const protocol::Param& p) { return Pair(p.name, TypeName(p.type)); });
}

template <>
void Handle<Id::ProcessRequest>(Context& context, Reader& in, Writer& out) {
  std::string name(in.Text());
  protocol::NameValues given, used, outputs;
  in.GetPairs([&](std::string_view n, std::string_view v) { given.push_back({std::string(n), std::string(v)}); });
  RunByName(context, name, given, used, outputs);
  protocol::NameValues all = used;
  all.insert(all.end(), outputs.begin(), outputs.end());
  out.Put(all);
  out.Put(outputs);
}

// "Command Name=Value ...": the outputs come back one "Name=Value" line each.
template <>
void Handle<Id::PSL>(Context& context, Reader& in, Writer& out) {
  std::vector<std::string> words = Words(in.Text());
  if (words.empty()) Refuse("the command line is empty");
  protocol::NameValues given, used, outputs;
  for (std::size_t i = 1; i < words.size(); ++i) {
    std::size_t equals = words[i].find('=');
    if (equals == std::string::npos) Refuse("'" + words[i] + "' is not of the form Name=Value");
    given.push_back({words[i].substr(0, equals), words[i].substr(equals + 1)});
  }
  RunByName(context, words[0], given, used, outputs);
  std::string text;
  for (const protocol::NameValue& p : outputs) text += p.name + "=" + p.value + "\n";
  out.Put(text);
}

template <>
void Handle<Id::GetFrameCount>(Context& context, Reader&, Writer& out) {
  out.Put(static_cast<std::uint32_t>(context.scene.frames));
}

template <>
void Handle<Id::SetLanguage>(Context& context, Reader& in, Writer&) {
  std::string_view language = in.Text();
  if (std::find(kLanguages.begin(), kLanguages.end(), language) == kLanguages.end())
    Refuse("'" + std::string(language) + "' is not a language of the application (en, de, fr, es, ja, zh)");
  context.language = language;
}

template <>
void Handle<Id::Log>(Context&, Reader& in, Writer&) {
  std::string_view level = in.Text(), message = in.Text();
  if (std::find(kLevels.begin(), kLevels.end(), level) == kLevels.end())
    Refuse("'" + std::string(level) + "' is not a log level (debug, info, warning, error)");
  LogLine(level, message);
}

template <>
void Handle<Id::GetSceneName>(Context& context, Reader&, Writer& out) {
  out.Put(context.scene.name);
  out.Put(context.scene.path);
}

template <>
void Handle<Id::SetSceneName>(Context& context, Reader& in, Writer&) {
  std::string_view name = in.Text();
  if (name.empty()) Refuse("a scene name cannot be empty");
  context.scene.name = name;
}

template <>
void Handle<Id::GetSubjectNames>(Context& context, Reader&, Writer& out) {
  auto& subjects = context.scene.subjects;
  out.Put(NamesOf(subjects));
  out.PutTexts(subjects, [](const Subject& s) -> std::string_view { return s.model; });
  std::vector<bool> active;
  for (const Subject& s : subjects) active.push_back(s.active);
  out.Put(active);
}

template <>
void Handle<Id::GetMarkerNames>(Context& context, Reader& in, Writer& out) {
  out.Put(NamesOf(SubjectOf(context.scene, in.Text()).markers));
}

template <>
void Handle<Id::GetBoneNames>(Context& context, Reader& in, Writer& out) {
  std::string_view subject = in.Text();
  out.Put(NamesOf(SkeletonOf(context.scene, subject, in.Text()).bones));
}

template <>
void Handle<Id::GetRootBone>(Context& context, Reader& in, Writer& out) {
  std::string_view subject = in.Text();
  Subject& s = SkeletonOf(context.scene, subject, in.Text());
  auto root = std::find_if(s.bones.begin(), s.bones.end(), [](const Bone& b) { return b.parent.empty(); });
  out.Put(root == s.bones.end() ? std::string() : root->name);
}

template <>
void Handle<Id::GetBoneDetails>(Context& context, Reader& in, Writer& out) {
  std::string_view subject = in.Text(), skeleton = in.Text();
  Subject& s = SkeletonOf(context.scene, subject, skeleton);
  Bone& bone = Named(s.bones, in.Text(), "bone", s);
  out.Put(bone.parent);
  out.Put(bone.children);
}

template <>
void Handle<Id::GetConstraintNames>(Context& context, Reader& in, Writer& out) {
  std::string_view subject = in.Text();
  out.Put(NamesOf(SkeletonOf(context.scene, subject, in.Text()).constraints));
}

template <>
void Handle<Id::GetConstraintDetails>(Context& context, Reader& in, Writer& out) {
  std::string_view subject = in.Text(), skeleton = in.Text();
  Subject& s = SkeletonOf(context.scene, subject, skeleton);
  Constraint& c = Named(s.constraints, in.Text(), "constraint", s);
  out.Put(c.active);
  out.Put(c.source);
  out.Put(c.target);
  out.Put(c.offset);
  out.Put(c.type);
}

template <>
void Handle<Id::GetSubjectParamNames>(Context& context, Reader& in, Writer& out) {
  std::string_view subject = in.Text();
  out.Put(NamesOf(SkeletonOf(context.scene, subject, in.Text()).parameters));
}

template <>
void Handle<Id::GetSubjectParamDetails>(Context& context, Reader& in, Writer& out) {
  std::string_view subject = in.Text(), skeleton = in.Text();
  Subject& s = SkeletonOf(context.scene, subject, skeleton);
  SubjectParameter& p = Named(s.parameters, in.Text(), "parameter", s);
  out.Put(p.value);
  out.Put(p.fallback);
  out.Put(p.unit);
  out.Put(p.required);
}

Marker& MarkerOf(Scene& scene, Reader& in) {
  Subject& s = SubjectOf(scene, in.Text());
  return Named(s.markers, in.Text(), "marker", s);
}

template <>
void Handle<Id::GetTrajectory>(Context& context, Reader& in, Writer& out) {
  Marker& m = MarkerOf(context.scene, in);
  out.Put(m.x), out.Put(m.y), out.Put(m.z), out.Put(m.e);
}

template <>
void Handle<Id::SetTrajectory>(Context& context, Reader& in, Writer&) {
  Marker& m = MarkerOf(context.scene, in);
  std::vector<double> x, y, z;
  std::vector<bool> e;
  in.Get(x), in.Get(y), in.Get(z), in.Get(e);
  auto frames = static_cast<std::size_t>(context.scene.frames);
  if (x.size() != frames || y.size() != frames || z.size() != frames || e.size() != frames)
    Refuse("a trajectory needs " + std::to_string(frames) + " frames in X, Y, Z and E (given " + std::to_string(x.size()) + ", " +
           std::to_string(y.size()) + ", " + std::to_string(z.size()) + ", " + std::to_string(e.size()) + ")");
  m.x = std::move(x), m.y = std::move(y), m.z = std::move(z), m.e = std::move(e);
}

template <>
void Handle<Id::GetTrajectoryAtFrame>(Context& context, Reader& in, Writer& out) {
  Marker& m = MarkerOf(context.scene, in);
  std::size_t f = FrameIndex(context.scene, in.Get<std::int32_t>());
  auto n = static_cast<std::size_t>(context.faults.framesPerFrame);
  out.Put(std::vector<double>(n, m.x[f])), out.Put(std::vector<double>(n, m.y[f])), out.Put(std::vector<double>(n, m.z[f]));
  out.Put(std::vector<bool>(n, m.e[f]));
}

template <>
void Handle<Id::SetTrajectoryAtFrame>(Context& context, Reader& in, Writer&) {
  Marker& m = MarkerOf(context.scene, in);
  std::size_t f = FrameIndex(context.scene, in.Get<std::int32_t>());
  double x = in.Get<double>(), y = in.Get<double>(), z = in.Get<double>();
  m.e[f] = in.Get<bool>();
  m.x[f] = x, m.y[f] = y, m.z[f] = z;
}

using Handler = void (*)(Context&, Reader&, Writer&);
constexpr Handler kHandlers[] = {
#define CLIENT3_HANDLER(name, description, in, out) &Handle<Id::name>,
    CLIENT3_COMMANDS(CLIENT3_HANDLER)
#undef CLIENT3_HANDLER
};

}  // namespace

void Run(Id id, Context& context, Reader& in, Writer& out) { kHandlers[static_cast<std::size_t>(id)](context, in, out); }

}  // namespace client3::host
