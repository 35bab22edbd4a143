// Writing and reading scene files.
//
//   client3-scene 1
//   frames 1000
//   timeline RATE TICKS PLAY_START PLAY_END ANIM_START ANIM_END STANDARD
//   ranges FIRST-LAST,...            (selected frame ranges; "-" for none)
//   settings RECORD FIELD=VALUE...   (one line per settings record; a record without a line, and
//                                     a field a line does not name, keep their defaults)
//   analog SAMPLES_PER_FRAME GENERAL_SCALE  (only with analog channels)
//   group NAME DESCRIPTION           (a kept group of an imported C3D file, then its parameters:)
//   groupparameter NAME DESCRIPTION TYPE DIMENSIONS DATA  (DIMENSIONS separated by commas, "-" for
//                                     none; DATA the bytes of the Intel form)
//   object INDEX PARENT TYPE NAME    (the root is object 0 with parent "-"; parents come first)
//   attribute NAME VALUE             (of the object above)
//   parameter NAME KIND VALUE DEFAULT UNIT REQUIRED
//   channel NAME DEFAULT VALUES FLAGS  (values of every frame separated by commas; one flag a
//                                       frame: 0 no key, 1 key, 2 selected key)
//   samples VALUES                   (of an Analog object: its samples separated by commas)
//   selection INDEX...
//   active INDEX                     (the active clip; "-" for none)
//   end
//
// Every word is percent-encoded: bytes other than letters, digits and "-._,:" are written %XX,
// and the empty text as a lone %.
#include "host/files/scenefile.h"

#include <algorithm>
#include <cctype>
#include <cmath>
#include <map>

#include "host/scene/failure.h"
#include "host/server/text.h"
#include "platform/files.h"

namespace client3::host {

namespace {

constexpr std::string_view kMagic = "client3-scene";
constexpr int kMaxFrames = 1'000'000;
// The largest scene file the application reads.
constexpr std::uintmax_t kMaxSceneFile = std::uintmax_t{2} << 30;

using Words = std::vector<std::string_view>;

std::string Encode(std::string_view text) {
  if (text.empty()) return "%";
  static const char* hex = "0123456789ABCDEF";
  std::string out;
  for (unsigned char c : text) {
    if (std::isalnum(c) || c == '-' || c == '.' || c == '_' || c == ',' || c == ':')
      out += static_cast<char>(c);
    else
      out += '%', out += hex[c >> 4], out += hex[c & 15];
  }
  return out;
}

[[noreturn]] void Bad(std::size_t line, const std::string& why) {
  Refuse("the scene file is damaged at line " + std::to_string(line) + ": " + why);
}

std::string Decode(std::string_view word, std::size_t line) {
  if (word == "%") return {};
  std::string out;
  auto digit = [&](char c) -> int {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    Bad(line, "a broken escape");
  };
  for (std::size_t i = 0; i < word.size(); ++i) {
    if (word[i] != '%') {
      out += word[i];
      continue;
    }
    if (i + 2 >= word.size()) Bad(line, "a broken escape");
    out += static_cast<char>(digit(word[i + 1]) * 16 + digit(word[i + 2]));
    i += 2;
  }
  return out;
}

// The values separated by commas, each as `text` writes it; "-" for none.
std::string Joined(const auto& values, auto text) {
  std::string out;
  for (const auto& v : values) out.append(out.empty() ? "" : ",").append(text(v));
  return out.empty() ? "-" : out;
}

// The numbers of a list separated by commas; "-" is none.
template <class T>
std::vector<T> NumbersOf(std::string_view list, std::size_t line) {
  std::vector<T> out;
  if (list == "-") return out;
  ForEachItem(list, [&](std::string_view item) {
    auto value = ParseNumber<T>(item);
    if (!value || (std::is_floating_point_v<T> && !std::isfinite(*value))) Bad(line, "a bad number in a list");
    out.push_back(*value);
  });
  return out;
}

// ---- Writing -------------------------------------------------------------------------------------

std::string Groups(const std::vector<c3d::Group>& groups) {
  std::string out;
  for (const c3d::Group& g : groups) {
    out += "group " + Encode(g.name) + " " + Encode(g.description) + "\n";
    for (const c3d::Parameter& p : g.parameters)
      out += "groupparameter " + Encode(p.name) + " " + Encode(p.description) + " " + std::to_string(p.type) + " " +
             Joined(p.dims, [](int d) { return std::to_string(d); }) + " " + Encode(p.data) + "\n";
  }
  return out;
}

// An object's line and the lines of its attributes, parameters, channels and samples.
std::string ObjectLines(Scene& scene, const Object& o, const std::map<ObjectId, std::size_t>& index) {
  std::string out = "object " + std::to_string(index.at(o.id)) + " " + (o.id == scene.root ? "-" : std::to_string(index.at(o.parent))) +
                    " " + Encode(o.type) + " " + Encode(o.name) + "\n";
  for (const Attribute& a : o.attributes)
    if (!Computed(a.name)) out += "attribute " + Encode(a.name) + " " + Encode(a.value) + "\n";
  for (const Parameter& p : o.parameters)
    out += "parameter " + Encode(p.name) + " " + std::to_string(static_cast<int>(p.kind)) + " " + Encode(p.value) + " " +
           Encode(p.fallback) + " " + Encode(p.unit) + " " + (p.required ? "1" : "0") + "\n";
  for (const Channel& c : o.channels) {
    out += "channel " + Encode(c.name) + " " + NumberText(c.fallback) + " " + Joined(c.values, NumberText) + " ";
    for (std::size_t f = 0; f < c.keys.size(); ++f) out += c.selected[f] ? '2' : c.keys[f] ? '1' : '0';
    out += "\n";
  }
  if (auto column = scene.analog.column.find(o.id); column != scene.analog.column.end())
    out += "samples " + Joined(scene.analog.data.Channel(column->second), FloatText) + "\n";
  return out;
}

// ---- Reading -------------------------------------------------------------------------------------

// The lines of a scene file, each split into words at every blank, read one after another. A
// problem is reported at the line last read.
class Lines {
 public:
  explicit Lines(std::string_view text) {
    while (!text.empty()) {
      std::size_t end = text.find('\n');
      if (end == std::string_view::npos) host::Bad(lines_.size() + 1, "the file ends in the middle of a line");
      Words words;
      ForEachItem(text.substr(0, end), [&](std::string_view word) { words.push_back(word); }, ' ');
      lines_.push_back(std::move(words));
      text.remove_prefix(end + 1);
    }
  }

  // The number of the line last read; whether every line has been read.
  std::size_t read() const { return at_; }
  bool done() const { return at_ == lines_.size(); }
  // Whether the next line is of `kind`.
  bool At(std::string_view kind) const { return at_ < lines_.size() && lines_[at_][0] == kind; }
  // The next line, whatever its kind.
  const Words& Take() { return lines_[at_++]; }
  // The next line, which must be of `kind` with from `least` to `most` values after it.
  const Words& Next(std::string_view kind, std::size_t least, std::size_t most) {
    if (at_ >= lines_.size()) host::Bad(at_ + 1, "the file ends before '" + std::string(kind) + "'");
    const Words& words = lines_[at_++];
    if (words[0] != kind) Bad("expected '" + std::string(kind) + "'");
    if (words.size() < least + 1 || words.size() > most + 1) Bad("'" + std::string(kind) + "' has the wrong number of values");
    return words;
  }
  // `word` as a whole number from `least` to `most`.
  int Number(std::string_view word, long least, long most) const {
    auto v = ParseInt(word);
    if (!v || *v < least || *v > most)
      Bad("'" + std::string(word) + "' is not a number from " + std::to_string(least) + " to " + std::to_string(most));
    return static_cast<int>(*v);
  }
  // The text that `word` encodes.
  std::string Text(std::string_view word) const { return Decode(word, at_); }
  [[noreturn]] void Bad(const std::string& why) const { host::Bad(at_, why); }

 private:
  std::vector<Words> lines_;
  std::size_t at_ = 0;
};

Timeline ReadTimeline(Lines& lines, int frames) {
  const Words& tl = lines.Next("timeline", 7, 7);
  Timeline t;
  auto rate = ParseDouble(tl[1]);
  if (!rate || !TimelineHolds(*rate)) lines.Bad("an unsupported frame rate");
  t.rate = *rate;
  std::optional<std::uint64_t> ticks = ParseNumber<std::uint64_t>(tl[2]);
  if (!ticks) lines.Bad("a bad time");
  t.playStart = lines.Number(tl[3], 1, frames), t.playEnd = lines.Number(tl[4], 1, frames);
  t.animStart = lines.Number(tl[5], 1, frames), t.animEnd = lines.Number(tl[6], 1, frames);
  if (t.animStart > t.playStart || t.playStart > t.playEnd || t.playEnd > t.animEnd) lines.Bad("ranges out of order");
  t.standard = lines.Text(tl[7]);
  if (std::find(std::begin(kTimeCodeStandards), std::end(kTimeCodeStandards), t.standard) == std::end(kTimeCodeStandards))
    lines.Bad("an unknown time-code standard");
  if (*ticks > t.TicksOf(frames)) lines.Bad("a time past the end of the take");
  t.ticks = *ticks;
  t.selected.assign(static_cast<std::size_t>(frames), false);
  if (const Words& r = lines.Next("ranges", 1, 1); r[1] != "-")
    ForEachItem(r[1], [&](std::string_view range) {
      std::size_t dash = range.find('-');
      if (dash == std::string_view::npos) lines.Bad("a broken range");
      int first = lines.Number(range.substr(0, dash), 1, frames), last = lines.Number(range.substr(dash + 1), first, frames);
      std::fill(t.selected.begin() + first - 1, t.selected.begin() + last, true);
    });
  return t;
}

// A settings field's value in its canonical text, as the record's getter would give it back.
std::optional<std::string> SettingText(const protocol::Param& field, const std::string& text) {
  if (field.type == protocol::Type::String) return text;
  protocol::Writer value;
  if (!FromText(text, field.type, value)) return std::nullopt;
  protocol::Reader back(value.Finish().substr(protocol::kHeaderSize));
  return ToText(back, field.type);
}

// The values of a settings line, in canonical text in the order of the record's fields: by name
// (FIELD=VALUE), a field the line does not name keeping its default; or, in a line without names (as
// files written before they were named hold them), every field's value in order.
std::vector<std::string> SettingValues(Lines& lines, Record record, const Words& words) {
  std::string name(RecordName(record));
  auto fields = FieldsOf(record);
  std::vector<std::string> values = Settings().values[static_cast<std::size_t>(record)];
  bool named = words.size() == 2 || std::any_of(words.begin() + 2, words.end(), [](std::string_view w) { return w.find('=') != w.npos; });
  if (!named && words.size() - 2 != fields.size()) lines.Bad("the " + name + " settings need " + std::to_string(fields.size()) + " values");
  std::vector<bool> given(fields.size());
  for (std::size_t w = 2; w < words.size(); ++w) {
    std::size_t i = w - 2;
    std::string_view value = words[w];
    if (named) {
      std::size_t equals = value.find('=');
      if (equals == std::string_view::npos) lines.Bad("a value of the " + name + " settings without its field's name");
      std::string field = lines.Text(value.substr(0, equals));
      auto called = [&](const protocol::Param& p) { return p.name == field; };
      i = static_cast<std::size_t>(std::find_if(fields.begin(), fields.end(), called) - fields.begin());
      if (i == fields.size()) lines.Bad("the " + name + " settings have no field '" + field + "'");
      if (given[i]) lines.Bad("the " + name + " setting '" + field + "' is given twice");
      value = value.substr(equals + 1);
    }
    given[i] = true;
    std::optional<std::string> text = SettingText(fields[i], lines.Text(value));
    if (!text) lines.Bad("a bad value of " + name + " setting '" + std::string(fields[i].name) + "'");
    values[i] = *text;
  }
  return values;
}

Settings ReadSettings(Lines& lines) {
  Settings settings;
  while (lines.At("settings")) {
    const Words& words = lines.Take();
    if (words.size() < 2) lines.Bad("'settings' without a record");
    std::optional<Record> record = RecordNamed(words[1]);
    if (!record) lines.Bad("no settings named '" + std::string(words[1]) + "'");
    if (std::string why = settings.Set(*record, SettingValues(lines, *record, words)); !why.empty()) lines.Bad(why);
  }
  return settings;
}

// The analog channels' samples as the lines give them, before they become the scene's.
struct AnalogLines {
  std::size_t samplesPerFrame = 0;
  double generalScale = 1;
  std::vector<std::vector<float>> channels;
};

// The line `analog SAMPLES_PER_FRAME GENERAL_SCALE`, where there is one.
AnalogLines ReadAnalog(Lines& lines) {
  if (!lines.At("analog")) return {};
  const Words& w = lines.Take();
  auto perFrame = w.size() == 3 ? ParseInt(w[1]) : std::nullopt;
  auto general = w.size() == 3 ? ParseDouble(w[2]) : std::nullopt;
  if (!perFrame || *perFrame < 1 || *perFrame > 65535 || !general) lines.Bad("a bad 'analog' line");
  return {static_cast<std::size_t>(*perFrame), *general, {}};
}

std::vector<c3d::Group> ReadGroups(Lines& lines) {
  std::vector<c3d::Group> groups;
  while (lines.At("group") || lines.At("groupparameter")) {
    const Words& w = lines.Take();
    if (w[0] == "group" && w.size() == 3) {
      groups.push_back({lines.Text(w[1]), lines.Text(w[2]), {}});
      const c3d::Group& g = groups.back();
      if (!c3d::ValidName(g.name) || c3d::OwnGroup(g.name) || g.description.size() > 255) lines.Bad("a bad group");
      continue;
    }
    if (w.size() != 6 || groups.empty()) lines.Bad("a group parameter out of place");
    c3d::Parameter p{lines.Text(w[1]), lines.Text(w[2]), 0, {}, lines.Text(w[5])};
    auto type = ParseInt(w[3]);
    if (!type || (*type != -1 && *type != 1 && *type != 2 && *type != 4)) lines.Bad("a bad parameter type");
    p.type = static_cast<std::int8_t>(*type);
    std::size_t size = static_cast<std::size_t>(std::abs(*type));
    for (int d : NumbersOf<int>(w[4], lines.read())) {
      if (d < 0 || d > 255) lines.Bad("a bad dimension");
      p.dims.push_back(static_cast<std::uint8_t>(d)), size *= static_cast<std::size_t>(d);
    }
    if (size != p.data.size() || !c3d::ValidName(p.name) || p.description.size() > 255) lines.Bad("a bad group parameter");
    groups.back().parameters.push_back(std::move(p));
  }
  return groups;
}

// An object's line: its index, its parent's, its type and its name. Returns the object, the root or
// one added under its parent.
Object& ReadObject(Lines& lines, Scene& scene, const std::vector<ObjectId>& ids) {
  const Words& o = lines.Next("object", 4, 4);
  std::string type = lines.Text(o[3]), name = lines.Text(o[4]);
  if (lines.Number(o[1], 0, static_cast<long>(ids.size())) != static_cast<int>(ids.size())) lines.Bad("objects out of order");
  if (ids.empty()) {
    if (o[2] != "-" || type != "Scene" || name.empty()) lines.Bad("the first object must be the scene");
    scene.Root().name = name;
    return scene.Root();
  }
  Object& parent = scene.objects.at(ids[static_cast<std::size_t>(lines.Number(o[2], 0, static_cast<long>(ids.size()) - 1))]);
  if (!KnownType(type) || !MayContain(parent.type, type)) lines.Bad("a " + type + " cannot be a child of a " + parent.type);
  if (!BadName(name).empty() || scene.Child(parent, name)) lines.Bad("a bad or repeated name");
  return scene.Add(parent.id, type, name);
}

void ReadAttribute(Lines& lines, Object& object) {
  const Words& a = lines.Next("attribute", 2, 2);
  std::string name = lines.Text(a[1]);
  Attribute* attribute = object.FindAttribute(name);
  if (!attribute || Computed(name)) lines.Bad("an unknown attribute '" + name + "'");
  std::optional<std::string> value = Canonical(attribute->type, lines.Text(a[2]));
  if (!value) lines.Bad("a bad value of attribute '" + name + "'");
  if (name == "ConstraintType" && std::find(std::begin(kConstraintTypes), std::end(kConstraintTypes), *value) == std::end(kConstraintTypes))
    lines.Bad("an unknown constraint type");
  attribute->value = *value;
}

void ReadParameter(Lines& lines, Object& object) {
  const Words& p = lines.Next("parameter", 6, 6);
  Parameter parameter{NewId(), lines.Text(p[1]), static_cast<ParameterKind>(lines.Number(p[2], 1, 2)), lines.Text(p[3]),
                      lines.Text(p[4]), lines.Text(p[5]), lines.Number(p[6], 0, 1) == 1};
  if (!BadName(parameter.name).empty() || object.FindParameter(parameter.name)) lines.Bad("a bad or repeated parameter name");
  if (parameter.kind == ParameterKind::Number) {
    auto value = Canonical(ValueType::Float, parameter.value), fallback = Canonical(ValueType::Float, parameter.fallback);
    if (!value || !fallback) lines.Bad("a parameter value that is not a number");
    parameter.value = *value, parameter.fallback = *fallback;
  }
  object.parameters.push_back(std::move(parameter));
}

// A channel of the object's type, or one of the channels that solving and retargeting give a bone.
void ReadChannel(Lines& lines, Scene& scene, Object& object, std::vector<std::string>& seen) {
  const Words& c = lines.Next("channel", 4, 4);
  std::string name = lines.Text(c[1]);
  Channel* channel = object.FindChannel(name);
  bool solved = std::find(std::begin(kBoneChannels), std::end(kBoneChannels), name) != std::end(kBoneChannels);
  if (!channel && object.type == "Bone" && solved) channel = &scene.AddChannel(object, name);
  if (!channel || std::find(seen.begin(), seen.end(), name) != seen.end()) lines.Bad("an unknown or repeated channel");
  seen.push_back(name);
  auto fallback = ParseDouble(c[2]);
  if (!fallback) lines.Bad("a bad default value");
  std::string_view flags = c[4];
  if (flags.size() != static_cast<std::size_t>(scene.frames)) lines.Bad("a channel without one flag a frame");
  std::size_t f = 0;
  ForEachItem(c[3], [&](std::string_view item) {
    auto v = ParseDouble(item);
    if (!v || f >= channel->values.size()) lines.Bad("a channel without one value a frame");
    channel->values[f++] = *v;
  });
  if (f != channel->values.size()) lines.Bad("a channel without one value a frame");
  for (f = 0; f < flags.size(); ++f) {
    if (flags[f] < '0' || flags[f] > '2') lines.Bad("a bad key flag");
    channel->keys[f] = flags[f] != '0', channel->selected[f] = flags[f] == '2';
  }
  channel->fallback = *fallback;
}

// An Analog object's samples: one list of samplesPerFrame for every frame.
void ReadSamples(Lines& lines, Scene& scene, const Object& object, AnalogLines& analog) {
  std::string_view list = lines.Next("samples", 1, 1)[1];
  if (object.type != "Analog" || scene.analog.column.contains(object.id) || analog.samplesPerFrame == 0) lines.Bad("samples out of place");
  scene.analog.column[object.id] = analog.channels.size();
  analog.channels.push_back(NumbersOf<float>(list, lines.read()));
  if (analog.channels.back().size() != static_cast<std::size_t>(scene.frames) * analog.samplesPerFrame)
    lines.Bad("an analog channel without its samples for every frame");
}

// Every object with what follows its line; returns their ids in the file's order.
std::vector<ObjectId> ReadObjects(Lines& lines, Scene& scene, AnalogLines& analog) {
  std::vector<ObjectId> ids;
  while (lines.At("object")) {
    Object& object = ReadObject(lines, scene, ids);
    ids.push_back(object.id);
    std::vector<std::string> channels;
    for (;;) {
      if (lines.At("samples")) ReadSamples(lines, scene, object, analog);
      else if (lines.At("attribute")) ReadAttribute(lines, object);
      else if (lines.At("parameter")) ReadParameter(lines, object);
      else if (lines.At("channel")) ReadChannel(lines, scene, object, channels);
      else break;
    }
  }
  if (ids.empty()) Bad(lines.read() + 1, "no scene object");
  for (ObjectId id : ids)
    if (scene.objects.at(id).type == "Analog" && !scene.analog.column.contains(id)) Bad(lines.read() + 1, "an analog channel without samples");
  if (analog.samplesPerFrame > 0)
    scene.analog.data = c3d::AnalogData::FromChannels(analog.channels, analog.samplesPerFrame, static_cast<std::size_t>(scene.frames));
  return ids;
}

// The selection and the active clip, by the objects' indices.
void ReadSelection(Lines& lines, Scene& scene, const std::vector<ObjectId>& ids) {
  const Words& selection = lines.Next("selection", 0, ids.size());
  for (std::size_t i = 1; i < selection.size(); ++i) {
    ObjectId id = ids[static_cast<std::size_t>(lines.Number(selection[i], 1, static_cast<long>(ids.size()) - 1))];
    if (std::find(scene.selection.begin(), scene.selection.end(), id) != scene.selection.end()) lines.Bad("an object selected twice");
    scene.selection.push_back(id);
  }
  if (const Words& active = lines.Next("active", 1, 1); active[1] != "-") {
    Object& clip = scene.objects.at(ids[static_cast<std::size_t>(lines.Number(active[1], 1, static_cast<long>(ids.size()) - 1))]);
    if (clip.type != "Clip") lines.Bad("the active clip is not a clip");
    scene.activeClip = clip.id;
  }
}

}  // namespace

std::string WriteScene(Scene& scene) {
  const Timeline& t = scene.timeline;
  std::string out = std::string(kMagic) + " 1\nframes " + std::to_string(scene.frames) + "\n";
  out += "timeline " + NumberText(t.rate) + " " + std::to_string(t.Now()) + " " + std::to_string(t.playStart) + " " +
         std::to_string(t.playEnd) + " " + std::to_string(t.animStart) + " " + std::to_string(t.animEnd) + " " + Encode(t.standard) + "\n";
  std::string ranges = RangesText(Runs(t.selected.size(), [&](std::size_t f) { return t.selected[f]; }));
  out.append("ranges ").append(ranges.empty() ? "-" : ranges).append(1, '\n');
  for (std::size_t r = 0; r < kRecordCount; ++r) {
    out.append("settings ").append(RecordName(static_cast<Record>(r)));
    auto fields = FieldsOf(static_cast<Record>(r));
    for (std::size_t i = 0; i < fields.size(); ++i)
      out.append(1, ' ').append(Encode(fields[i].name)).append(1, '=').append(Encode(scene.settings.values[r][i]));
    out += "\n";
  }
  if (scene.analog.data.samplesPerFrame() > 0)
    out += "analog " + std::to_string(scene.analog.data.samplesPerFrame()) + " " + NumberText(scene.analog.generalScale) + "\n";
  out += Groups(scene.fileGroups);
  std::map<ObjectId, std::size_t> index{{scene.root, 0}};
  for (ObjectId id : scene.Descendants(scene.root)) index.emplace(id, index.size());
  out += ObjectLines(scene, scene.Root(), index);
  for (ObjectId id : scene.Descendants(scene.root)) out += ObjectLines(scene, scene.objects.at(id), index);
  out += "selection";
  for (ObjectId id : scene.selection) out.append(1, ' ').append(std::to_string(index.at(id)));
  out += "\nactive " + (scene.activeClip ? std::to_string(index.at(scene.activeClip)) : std::string("-")) + "\nend\n";
  return out;
}

Scene ReadScene(std::string_view text) {
  Lines lines(text);
  if (lines.Next(kMagic, 1, 1)[1] != "1") Bad(1, "not a version of the scene file that this application reads");
  Scene scene(lines.Number(lines.Next("frames", 1, 1)[1], 1, kMaxFrames));
  scene.timeline = ReadTimeline(lines, scene.frames);
  scene.settings = ReadSettings(lines);
  AnalogLines analog = ReadAnalog(lines);
  scene.analog.generalScale = analog.generalScale;
  scene.fileGroups = ReadGroups(lines);
  std::vector<ObjectId> ids = ReadObjects(lines, scene, analog);
  ReadSelection(lines, scene, ids);
  lines.Next("end", 0, 0);
  if (!lines.done()) Bad(lines.read() + 1, "lines after the end");
  return scene;
}

Scene LoadScene(const std::string& path) {
  std::string text;
  if (!platform::ReadFile(path, text, kMaxSceneFile)) Refuse("cannot read the file '" + path + "'");
  Scene scene = ReadScene(text);
  scene.path = path;
  return scene;
}

}  // namespace client3::host
