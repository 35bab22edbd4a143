// The handlers of the connection, command-protocol and subject commands, and the dispatch of every
// command to its group's handler.
#include "host/commands.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdio>
#include <ctime>
#include <optional>
#include <unordered_map>

#include "host/handlers.h"
#include "host/text.h"
#include "platform/net.h"

namespace client3::host {

using protocol::CommandOf;
using protocol::Id;
using protocol::Reader;
using protocol::Type;
using protocol::Writer;

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

Object& SubjectOf(Scene& scene, std::string_view name) {
  if (Object* s = scene.FindSubject(name)) return *s;
  Refuse("no subject named '" + std::string(name) + "'");
}

// A subject's skeleton: named after its model; an empty name means the subject's own.
Object& SkeletonOf(Scene& scene, std::string_view subject, std::string_view skeleton) {
  Object& s = SubjectOf(scene, subject);
  if (!skeleton.empty() && skeleton != s.Text("Model"))
    Refuse("subject '" + s.name + "' has no skeleton named '" + std::string(skeleton) + "'");
  return s;
}

Object& Named(const std::vector<Object*>& list, std::string_view name, std::string_view what, const Object& owner) {
  for (Object* item : list)
    if (item->name == name) return *item;
  Refuse("subject '" + owner.name + "' has no " + std::string(what) + " named '" + std::string(name) + "'");
}

template <class T>
std::vector<std::string> NamesOf(const std::vector<T>& list) {
  std::vector<std::string> names;
  for (const T& item : list) {
    if constexpr (std::is_pointer_v<T>)
      names.push_back(item->name);
    else
      names.push_back(item.name);
  }
  return names;
}

// The subject parameters: the subject's parameters of kind Number.
std::vector<Parameter*> SubjectParameters(Object& subject) {
  std::vector<Parameter*> out;
  for (Parameter& p : subject.parameters)
    if (p.kind == ParameterKind::Number) out.push_back(&p);
  return out;
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
void Handle(Context&, Reader&, Writer&);

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
  out.Put(context.scene.Name());
  out.Put(context.scene.path);
}

template <>
void Handle<Id::SetSceneName>(Context& context, Reader& in, Writer&) {
  std::string_view name = in.Text();
  if (name.empty()) Refuse("a scene name cannot be empty");
  context.scene.Root().name = name;
}

template <>
void Handle<Id::GetSubjectNames>(Context& context, Reader&, Writer& out) {
  std::vector<Object*> subjects = context.scene.OfType(context.scene.Root(), "Subject");
  out.Put(NamesOf(subjects));
  out.PutTexts(subjects, [](const Object* s) -> std::string_view { return s->Text("Model"); });
  std::vector<bool> active;
  for (const Object* s : subjects) active.push_back(s->Text("Active") == "true");
  out.Put(active);
}

template <>
void Handle<Id::GetMarkerNames>(Context& context, Reader& in, Writer& out) {
  Scene& scene = context.scene;
  out.Put(NamesOf(scene.OfType(SubjectOf(scene, in.Text()), "Marker")));
}

template <>
void Handle<Id::GetBoneNames>(Context& context, Reader& in, Writer& out) {
  std::string_view subject = in.Text();
  out.Put(NamesOf(context.scene.Bones(SkeletonOf(context.scene, subject, in.Text()))));
}

template <>
void Handle<Id::GetRootBone>(Context& context, Reader& in, Writer& out) {
  std::string_view subject = in.Text();
  std::vector<Object*> roots = context.scene.OfType(SkeletonOf(context.scene, subject, in.Text()), "Bone");
  out.Put(roots.empty() ? std::string() : roots.front()->name);
}

template <>
void Handle<Id::GetBoneDetails>(Context& context, Reader& in, Writer& out) {
  Scene& scene = context.scene;
  std::string_view subject = in.Text(), skeleton = in.Text();
  Object& s = SkeletonOf(scene, subject, skeleton);
  Object& bone = Named(scene.Bones(s), in.Text(), "bone", s);
  Object& parent = scene.objects.at(bone.parent);
  out.Put(parent.type == "Bone" ? parent.name : std::string());
  out.Put(NamesOf(scene.OfType(bone, "Bone")));
}

template <>
void Handle<Id::GetConstraintNames>(Context& context, Reader& in, Writer& out) {
  std::string_view subject = in.Text();
  out.Put(NamesOf(context.scene.OfType(SkeletonOf(context.scene, subject, in.Text()), "Constraint")));
}

template <>
void Handle<Id::GetConstraintDetails>(Context& context, Reader& in, Writer& out) {
  std::string_view subject = in.Text(), skeleton = in.Text();
  Object& s = SkeletonOf(context.scene, subject, skeleton);
  Object& c = Named(context.scene.OfType(s, "Constraint"), in.Text(), "constraint", s);
  out.Put(c.Text("Active") == "true");
  out.Put(c.Text("Source"));
  out.Put(c.Text("Target"));
  std::vector<float> offset;
  std::string_view text = c.Text("Offset");
  for (std::size_t from = 0; from <= text.size();) {
    std::size_t comma = std::min(text.find(',', from), text.size());
    offset.push_back(static_cast<float>(ParseDouble(text.substr(from, comma - from)).value_or(0)));
    from = comma + 1;
  }
  out.Put(offset);
  out.Put(c.Text("ConstraintType"));
}

template <>
void Handle<Id::GetSubjectParamNames>(Context& context, Reader& in, Writer& out) {
  std::string_view subject = in.Text();
  out.Put(NamesOf(SubjectParameters(SkeletonOf(context.scene, subject, in.Text()))));
}

template <>
void Handle<Id::GetSubjectParamDetails>(Context& context, Reader& in, Writer& out) {
  std::string_view subject = in.Text(), skeleton = in.Text(), name = in.Text();
  Object& s = SkeletonOf(context.scene, subject, skeleton);
  Parameter* p = s.FindParameter(name);
  if (!p || p->kind != ParameterKind::Number)
    Refuse("subject '" + s.name + "' has no parameter named '" + std::string(name) + "'");
  out.Put(static_cast<float>(ParseDouble(p->value).value_or(0)));
  out.Put(static_cast<float>(ParseDouble(p->fallback).value_or(0)));
  out.Put(p->unit);
  out.Put(p->required);
}

// A marker's trajectory: its channels X, Y and Z.
struct Trajectory {
  Channel &x, &y, &z;
  bool Seen(std::size_t f) const { return x.keys[f] && y.keys[f] && z.keys[f]; }
  double At(const Channel& c, std::size_t f) const { return c.values[f]; }
};

Trajectory TrajectoryOf(Scene& scene, Reader& in) {
  Object& s = SubjectOf(scene, in.Text());
  Object& m = Named(scene.OfType(s, "Marker"), in.Text(), "marker", s);
  return {*m.FindChannel("X"), *m.FindChannel("Y"), *m.FindChannel("Z")};
}

template <>
void Handle<Id::GetTrajectory>(Context& context, Reader& in, Writer& out) {
  Trajectory t = TrajectoryOf(context.scene, in);
  // The channels' values are the positions, written as they are stored.
  out.Put(t.x.values), out.Put(t.y.values), out.Put(t.z.values);
  char* seen = out.Block(protocol::Type::Bools, t.x.values.size(), 1);
  for (std::size_t f = 0; f < t.x.values.size(); ++f) seen[f] = t.Seen(f);
}

void SetFrame(Trajectory& t, std::size_t f, double x, double y, double z, bool seen) {
  if (seen) {
    t.x.SetKey(f, x), t.y.SetKey(f, y), t.z.SetKey(f, z);
  } else {
    t.x.DeleteKey(f), t.y.DeleteKey(f), t.z.DeleteKey(f);
    t.x.values[f] = x, t.y.values[f] = y, t.z.values[f] = z;
  }
}

template <>
void Handle<Id::SetTrajectory>(Context& context, Reader& in, Writer&) {
  Trajectory t = TrajectoryOf(context.scene, in);
  std::vector<double> x, y, z;
  std::vector<bool> e;
  in.Get(x), in.Get(y), in.Get(z), in.Get(e);
  auto frames = static_cast<std::size_t>(context.scene.frames);
  if (x.size() != frames || y.size() != frames || z.size() != frames || e.size() != frames)
    Refuse("a trajectory needs " + std::to_string(frames) + " frames in X, Y, Z and E (given " + std::to_string(x.size()) + ", " +
           std::to_string(y.size()) + ", " + std::to_string(z.size()) + ", " + std::to_string(e.size()) + ")");
  for (std::size_t f = 0; f < frames; ++f) SetFrame(t, f, x[f], y[f], z[f], e[f]);
}

template <>
void Handle<Id::GetTrajectoryAtFrame>(Context& context, Reader& in, Writer& out) {
  Trajectory t = TrajectoryOf(context.scene, in);
  std::size_t f = FrameIndex(context.scene, in.Get<std::int32_t>());
  auto n = static_cast<std::size_t>(context.faults.framesPerFrame);
  out.Put(std::vector<double>(n, t.At(t.x, f))), out.Put(std::vector<double>(n, t.At(t.y, f)));
  out.Put(std::vector<double>(n, t.At(t.z, f)));
  out.Put(std::vector<bool>(n, t.Seen(f)));
}

template <>
void Handle<Id::SetTrajectoryAtFrame>(Context& context, Reader& in, Writer&) {
  Trajectory t = TrajectoryOf(context.scene, in);
  std::size_t f = FrameIndex(context.scene, in.Get<std::int32_t>());
  double x = in.Get<double>(), y = in.Get<double>(), z = in.Get<double>();
  SetFrame(t, f, x, y, z, in.Get<bool>());
}

#define CLIENT3_ENTRY(name) {Id::name, &Handle<Id::name>}
#define CLIENT3_READ(name) {Id::name, &Handle<Id::name>, Access::Read}
constexpr HandlerEntry kSceneHandlers[] = {
    CLIENT3_READ(GetServerInfo),        CLIENT3_READ(GetCommandList),        CLIENT3_READ(GetCommandInfo),
    CLIENT3_ENTRY(ProcessRequest),      CLIENT3_READ(GetFrameCount),         CLIENT3_ENTRY(SetLanguage),
    CLIENT3_ENTRY(PSL),                 CLIENT3_READ(Log),                   CLIENT3_READ(GetSceneName),
    CLIENT3_ENTRY(SetSceneName),        CLIENT3_READ(GetSubjectNames),       CLIENT3_READ(GetMarkerNames),
    CLIENT3_READ(GetBoneNames),         CLIENT3_READ(GetRootBone),           CLIENT3_READ(GetBoneDetails),
    CLIENT3_READ(GetConstraintNames),   CLIENT3_READ(GetConstraintDetails),  CLIENT3_READ(GetSubjectParamNames),
    CLIENT3_READ(GetSubjectParamDetails), CLIENT3_READ(GetTrajectory),       CLIENT3_ENTRY(SetTrajectory),
    CLIENT3_READ(GetTrajectoryAtFrame), CLIENT3_ENTRY(SetTrajectoryAtFrame),
};
#undef CLIENT3_READ
#undef CLIENT3_ENTRY

// One handler per command number, from every group's table.
struct Dispatch {
  Handler handlers[protocol::kCommandCount] = {};
  Access access[protocol::kCommandCount] = {};
  Dispatch() {
    for (auto group : {SceneHandlers(), ObjectHandlers(), FileHandlers(), TimelineHandlers(), SettingsHandlers(), FilterHandlers(),
                       ProcessingHandlers(), InterchangeHandlers(), WorkspaceHandlers()})
      for (const HandlerEntry& entry : group) {
        Handler& slot = handlers[static_cast<std::size_t>(entry.id)];
        if (slot) {
          LogLine("error", "'" + std::string(CommandOf(entry.id).name) + "' has two handlers");
          std::abort();
        }
        slot = entry.handler;
        access[static_cast<std::size_t>(entry.id)] = entry.access;
      }
  }
};

}  // namespace

std::span<const HandlerEntry> SceneHandlers() { return kSceneHandlers; }

Object& ObjectOf(Scene& scene, ObjectId id) {
  if (Object* o = scene.Find(id)) return *o;
  Refuse("no object with id " + std::to_string(id));
}

std::size_t FrameIndex(const Scene& scene, int frame) {
  if (frame < 1 || frame > scene.frames)
    throw Failure{BadFrame, "frame " + std::to_string(frame) + " is outside the take (1 to " + std::to_string(scene.frames) + ")"};
  return static_cast<std::size_t>(frame - 1);
}

SelectMode ModeOf(int mode) {
  if (mode < 0 || mode > 3) Refuse("selection mode " + std::to_string(mode) + " is not one of 0 replace, 1 add, 2 remove, 3 toggle");
  return static_cast<SelectMode>(mode);
}

void ApplyMode(std::vector<bool>& selected, const std::vector<bool>& chosen, SelectMode mode) {
  for (std::size_t i = 0; i < selected.size(); ++i) {
    switch (mode) {
      case SelectMode::Replace: selected[i] = chosen[i]; break;
      case SelectMode::Add: selected[i] = selected[i] || chosen[i]; break;
      case SelectMode::Remove: selected[i] = selected[i] && !chosen[i]; break;
      case SelectMode::Toggle: selected[i] = selected[i] != chosen[i]; break;
    }
  }
}

static const Dispatch& Dispatched() {
  static const Dispatch dispatch;
  return dispatch;
}

Access AccessOf(Id id) {
  Handler handler = Dispatched().handlers[static_cast<std::size_t>(id)];
  return handler ? Dispatched().access[static_cast<std::size_t>(id)] : Access::Read;
}

void Run(Id id, Context& context, Reader& in, Writer& out) {
  Handler handler = Dispatched().handlers[static_cast<std::size_t>(id)];
  if (!handler) Refuse("'" + std::string(CommandOf(id).name) + "' is not available in this version of the application");
  handler(context, in, out);
}

}  // namespace client3::host
