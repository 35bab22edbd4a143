// Writing and reading scene files.
//
//   client3-scene 1
//   frames 1000
//   timeline RATE TICKS PLAY_START PLAY_END ANIM_START ANIM_END STANDARD
//   ranges FIRST-LAST,...            (selected frame ranges; "-" for none)
//   settings RECORD VALUE...         (one line per settings record, values in field order;
//                                     a record without a line keeps its defaults)
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
#include "host/scenefile.h"

#include <algorithm>
#include <cctype>
#include <charconv>
#include <cmath>
#include <map>

#include "host/failure.h"
#include "host/text.h"

namespace client3::host {

namespace {

constexpr std::string_view kMagic = "client3-scene";
constexpr int kMaxFrames = 1'000'000;

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

// A float in its shortest form that reads back exactly as a float.
std::string FloatText(float value) {
  char text[32];
  return std::string(text, std::to_chars(text, text + sizeof text, value).ptr);
}

std::string Joined(const auto& values, auto text) {
  std::string out;
  for (const auto& v : values) {
    if (!out.empty()) out += ',';
    out += text(v);
  }
  return out.empty() ? "-" : out;
}

// The numbers of a list separated by commas; "-" is none.
template <class T>
std::vector<T> NumbersOf(std::string_view list, std::size_t line) {
  std::vector<T> out;
  for (std::size_t from = 0; list != "-" && from <= list.size();) {
    std::size_t comma = std::min(list.find(',', from), list.size());
    auto value = ParseNumber<T>(list.substr(from, comma - from));
    if (!value || (std::is_floating_point_v<T> && !std::isfinite(*value))) Bad(line, "a bad number in a list");
    out.push_back(*value);
    from = comma + 1;
  }
  return out;
}

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

std::vector<c3d::Group> ReadGroups(const std::vector<std::vector<std::string_view>>& lines, std::size_t& at) {
  std::vector<c3d::Group> groups;
  for (; at < lines.size() && (lines[at][0] == "group" || lines[at][0] == "groupparameter"); ++at) {
    const auto& w = lines[at];
    if (w[0] == "group" && w.size() == 3) {
      groups.push_back({Decode(w[1], at + 1), Decode(w[2], at + 1), {}});
      const c3d::Group& g = groups.back();
      if (!c3d::ValidName(g.name) || c3d::OwnGroup(g.name) || g.description.size() > 255) Bad(at + 1, "a bad group");
      continue;
    }
    if (w.size() != 6 || groups.empty()) Bad(at + 1, "a group parameter out of place");
    c3d::Parameter p{Decode(w[1], at + 1), Decode(w[2], at + 1), 0, {}, Decode(w[5], at + 1)};
    auto type = ParseInt(w[3]);
    if (!type || (*type != -1 && *type != 1 && *type != 2 && *type != 4)) Bad(at + 1, "a bad parameter type");
    p.type = static_cast<std::int8_t>(*type);
    std::size_t size = static_cast<std::size_t>(std::abs(*type));
    for (int d : NumbersOf<int>(w[4], at + 1)) {
      if (d < 0 || d > 255) Bad(at + 1, "a bad dimension");
      p.dims.push_back(static_cast<std::uint8_t>(d)), size *= static_cast<std::size_t>(d);
    }
    if (size != p.data.size() || !c3d::ValidName(p.name) || p.description.size() > 255) Bad(at + 1, "a bad group parameter");
    groups.back().parameters.push_back(std::move(p));
  }
  return groups;
}

// The analog channels' samples as the lines give them, before they become the scene's.
struct AnalogLines {
  std::size_t samplesPerFrame = 0;
  double generalScale = 1;
  std::vector<std::vector<float>> channels;
};

// The line `analog SAMPLES_PER_FRAME GENERAL_SCALE`, where there is one.
AnalogLines ReadAnalog(const std::vector<std::vector<std::string_view>>& lines, std::size_t& at) {
  if (at >= lines.size() || lines[at][0] != "analog") return {};
  const auto& w = lines[at++];
  auto perFrame = w.size() == 3 ? ParseInt(w[1]) : std::nullopt;
  auto general = w.size() == 3 ? ParseDouble(w[2]) : std::nullopt;
  if (!perFrame || *perFrame < 1 || *perFrame > 65535 || !general) Bad(at, "a bad 'analog' line");
  return {static_cast<std::size_t>(*perFrame), *general, {}};
}

// An Analog object's samples: one list of samplesPerFrame for every frame.
void ReadSamples(std::string_view list, std::size_t line, Scene& scene, const Object& object, AnalogLines& analog) {
  if (object.type != "Analog" || scene.analog.column.contains(object.id) || analog.samplesPerFrame == 0) Bad(line, "samples out of place");
  scene.analog.column[object.id] = analog.channels.size();
  analog.channels.push_back(NumbersOf<float>(list, line));
  if (analog.channels.back().size() != static_cast<std::size_t>(scene.frames) * analog.samplesPerFrame)
    Bad(line, "an analog channel without its samples for every frame");
}

std::string Ranges(const std::vector<bool>& selected) {
  std::string out;
  for (std::size_t f = 0; f < selected.size(); ++f) {
    if (!selected[f]) continue;
    std::size_t last = f;
    while (last + 1 < selected.size() && selected[last + 1]) ++last;
    if (!out.empty()) out += ',';
    out.append(std::to_string(f + 1)).append(1, '-').append(std::to_string(last + 1));
    f = last;
  }
  return out.empty() ? "-" : out;
}

}  // namespace

std::string WriteScene(Scene& scene) {
  const Timeline& t = scene.timeline;
  std::string out = std::string(kMagic) + " 1\nframes " + std::to_string(scene.frames) + "\n";
  out += "timeline " + NumberText(t.rate) + " " + std::to_string(t.Now()) + " " + std::to_string(t.playStart) + " " +
         std::to_string(t.playEnd) + " " + std::to_string(t.animStart) + " " + std::to_string(t.animEnd) + " " + Encode(t.standard) + "\n";
  out.append("ranges ").append(Ranges(t.selected)).append(1, '\n');
  for (std::size_t r = 0; r < kRecordCount; ++r) {
    out.append("settings ").append(RecordName(static_cast<Record>(r)));
    for (const std::string& value : scene.settings.values[r]) out.append(1, ' ').append(Encode(value));
    out += "\n";
  }
  if (scene.analog.data.samplesPerFrame() > 0)
    out += "analog " + std::to_string(scene.analog.data.samplesPerFrame()) + " " + NumberText(scene.analog.generalScale) + "\n";
  out += Groups(scene.fileGroups);
  std::map<ObjectId, std::size_t> index;
  std::vector<ObjectId> order{scene.root};
  for (ObjectId id : scene.Descendants(scene.root)) order.push_back(id);
  for (ObjectId id : order) {
    Object& o = scene.objects.at(id);
    index[id] = index.size();
    out += "object " + std::to_string(index[id]) + " " + (id == scene.root ? "-" : std::to_string(index.at(o.parent))) + " " +
           Encode(o.type) + " " + Encode(o.name) + "\n";
    for (const Attribute& a : o.attributes)
      if (!Computed(a.name)) out += "attribute " + Encode(a.name) + " " + Encode(a.value) + "\n";
    for (const Parameter& p : o.parameters)
      out += "parameter " + Encode(p.name) + " " + std::to_string(static_cast<int>(p.kind)) + " " + Encode(p.value) + " " +
             Encode(p.fallback) + " " + Encode(p.unit) + " " + (p.required ? "1" : "0") + "\n";
    for (const Channel& c : o.channels) {
      out += "channel " + Encode(c.name) + " " + NumberText(c.fallback) + " ";
      for (std::size_t f = 0; f < c.values.size(); ++f) {
        if (f) out += ',';
        out += NumberText(c.values[f]);
      }
      out += " ";
      for (std::size_t f = 0; f < c.keys.size(); ++f) out += c.selected[f] ? '2' : c.keys[f] ? '1' : '0';
      out += "\n";
    }
    if (auto column = scene.analog.column.find(id); column != scene.analog.column.end())
      out += "samples " + Joined(scene.analog.data.Channel(column->second), FloatText) + "\n";
  }
  out += "selection";
  for (ObjectId id : scene.selection) out.append(1, ' ').append(std::to_string(index.at(id)));
  out += "\nactive " + (scene.activeClip ? std::to_string(index.at(scene.activeClip)) : std::string("-")) + "\nend\n";
  return out;
}

Scene ReadScene(std::string_view text) {
  std::vector<std::vector<std::string_view>> lines;
  while (!text.empty()) {
    std::size_t end = text.find('\n');
    if (end == std::string_view::npos) Bad(lines.size() + 1, "the file ends in the middle of a line");
    std::string_view line = text.substr(0, end);
    text.remove_prefix(end + 1);
    std::vector<std::string_view> words;
    for (std::size_t from = 0; from <= line.size();) {
      std::size_t space = std::min(line.find(' ', from), line.size());
      words.push_back(line.substr(from, space - from));
      from = space + 1;
    }
    lines.push_back(std::move(words));
  }
  std::size_t at = 0;
  auto next = [&](std::string_view kind, std::size_t least, std::size_t most) -> std::vector<std::string_view>& {
    if (at >= lines.size()) Bad(at + 1, "the file ends before '" + std::string(kind) + "'");
    auto& words = lines[at++];
    if (words[0] != kind) Bad(at, "expected '" + std::string(kind) + "'");
    if (words.size() < least + 1 || words.size() > most + 1) Bad(at, "'" + std::string(kind) + "' has the wrong number of values");
    return words;
  };
  auto number = [&](std::string_view word, long least, long most) {
    auto v = ParseInt(word);
    if (!v || *v < least || *v > most) {
      std::string why(1, '\'');
      why.append(word).append("' is not a number from ").append(std::to_string(least)).append(" to ").append(std::to_string(most));
      Bad(at, why);
    }
    return static_cast<int>(*v);
  };
  auto header = next(kMagic, 1, 1);
  if (header[1] != "1") Bad(1, "not a version of the scene file that this application reads");
  int frames = number(next("frames", 1, 1)[1], 1, kMaxFrames);
  auto& tl = next("timeline", 7, 7);
  Timeline t;
  auto rate = ParseDouble(tl[1]);
  if (!rate || !TimelineHolds(*rate)) Bad(at, "an unsupported frame rate");
  t.rate = *rate;
  std::uint64_t ticks = 0;
  if (auto [end, error] = std::from_chars(tl[2].data(), tl[2].data() + tl[2].size(), ticks);
      tl[2].empty() || error != std::errc() || end != tl[2].data() + tl[2].size())
    Bad(at, "a bad time");
  t.playStart = number(tl[3], 1, frames), t.playEnd = number(tl[4], 1, frames);
  t.animStart = number(tl[5], 1, frames), t.animEnd = number(tl[6], 1, frames);
  if (t.animStart > t.playStart || t.playStart > t.playEnd || t.playEnd > t.animEnd) Bad(at, "ranges out of order");
  t.standard = Decode(tl[7], at);
  if (std::find(std::begin(kTimeCodeStandards), std::end(kTimeCodeStandards), t.standard) == std::end(kTimeCodeStandards))
    Bad(at, "an unknown time-code standard");
  if (ticks > t.TicksOf(frames)) Bad(at, "a time past the end of the take");
  t.ticks = ticks;
  t.selected.assign(static_cast<std::size_t>(frames), false);
  if (auto& r = next("ranges", 1, 1); r[1] != "-") {
    std::string_view list = r[1];
    for (std::size_t from = 0; from <= list.size();) {
      std::size_t comma = std::min(list.find(',', from), list.size());
      std::string_view range = list.substr(from, comma - from);
      std::size_t dash = range.find('-');
      if (dash == std::string_view::npos) Bad(at, "a broken range");
      int first = number(range.substr(0, dash), 1, frames), last = number(range.substr(dash + 1), first, frames);
      std::fill(t.selected.begin() + first - 1, t.selected.begin() + last, true);
      from = comma + 1;
    }
  }
  Settings settings;
  while (at < lines.size() && lines[at][0] == "settings") {
    auto& words = lines[at++];
    if (words.size() < 2) Bad(at, "'settings' without a record");
    std::vector<std::string> values;
    for (std::size_t i = 2; i < words.size(); ++i) values.push_back(Decode(words[i], at));
    if (std::string why = SetRecordFromText(settings, words[1], values); !why.empty()) Bad(at, why);
  }
  Scene scene(frames);
  scene.timeline = t;
  scene.settings = settings;
  AnalogLines analog = ReadAnalog(lines, at);
  scene.analog.generalScale = analog.generalScale;
  scene.fileGroups = ReadGroups(lines, at);
  std::vector<ObjectId> ids;
  while (at < lines.size() && lines[at][0] == "object") {
    auto& o = next("object", 4, 4);
    std::string type = Decode(o[3], at), name = Decode(o[4], at);
    if (number(o[1], 0, static_cast<long>(ids.size())) != static_cast<int>(ids.size())) Bad(at, "objects out of order");
    Object* object;
    if (ids.empty()) {
      if (o[2] != "-" || type != "Scene" || name.empty()) Bad(at, "the first object must be the scene");
      object = &scene.Root();
      object->name = name;
    } else {
      Object& parent = scene.objects.at(ids[static_cast<std::size_t>(number(o[2], 0, static_cast<long>(ids.size()) - 1))]);
      if (!KnownType(type) || !MayContain(parent.type, type)) Bad(at, "a " + type + " cannot be a child of a " + parent.type);
      if (!BadName(name).empty() || scene.Child(parent, name)) Bad(at, "a bad or repeated name");
      object = &scene.Add(parent.id, type, name);
    }
    ids.push_back(object->id);
    std::vector<std::string> seenChannels;
    while (at < lines.size() && (lines[at][0] == "attribute" || lines[at][0] == "parameter" || lines[at][0] == "channel" ||
                                 lines[at][0] == "samples")) {
      std::string_view kind = lines[at][0];
      if (kind == "samples") {
        ReadSamples(next("samples", 1, 1)[1], at, scene, *object, analog);
      } else if (kind == "attribute") {
        auto& a = next("attribute", 2, 2);
        std::string aname = Decode(a[1], at);
        Attribute* attribute = object->FindAttribute(aname);
        if (!attribute || Computed(aname)) Bad(at, "an unknown attribute '" + aname + "'");
        std::optional<std::string> value = Canonical(attribute->type, Decode(a[2], at));
        if (!value) Bad(at, "a bad value of attribute '" + aname + "'");
        if (aname == "ConstraintType" && std::find(std::begin(kConstraintTypes), std::end(kConstraintTypes), *value) == std::end(kConstraintTypes))
          Bad(at, "an unknown constraint type");
        attribute->value = *value;
      } else if (kind == "parameter") {
        auto& p = next("parameter", 6, 6);
        Parameter parameter{NewId(), Decode(p[1], at), static_cast<ParameterKind>(number(p[2], 1, 2)), Decode(p[3], at),
                            Decode(p[4], at), Decode(p[5], at), number(p[6], 0, 1) == 1};
        if (!BadName(parameter.name).empty() || object->FindParameter(parameter.name)) Bad(at, "a bad or repeated parameter name");
        if (parameter.kind == ParameterKind::Number) {
          auto value = Canonical(ValueType::Float, parameter.value), fallback = Canonical(ValueType::Float, parameter.fallback);
          if (!value || !fallback) Bad(at, "a parameter value that is not a number");
          parameter.value = *value, parameter.fallback = *fallback;
        }
        object->parameters.push_back(std::move(parameter));
      } else {
        auto& c = next("channel", 4, 4);
        std::string cname = Decode(c[1], at);
        Channel* channel = object->FindChannel(cname);
        bool solved = std::find(std::begin(kBoneChannels), std::end(kBoneChannels), cname) != std::end(kBoneChannels);
        if (!channel && object->type == "Bone" && solved) channel = &scene.AddChannel(*object, cname);
        if (!channel || std::find(seenChannels.begin(), seenChannels.end(), cname) != seenChannels.end()) Bad(at, "an unknown or repeated channel");
        seenChannels.push_back(cname);
        auto fallback = ParseDouble(c[2]);
        if (!fallback) Bad(at, "a bad default value");
        std::string_view values = c[3], flags = c[4];
        if (flags.size() != static_cast<std::size_t>(frames)) Bad(at, "a channel without one flag a frame");
        std::size_t f = 0;
        for (std::size_t from = 0; from <= values.size(); ++f) {
          std::size_t comma = std::min(values.find(',', from), values.size());
          auto v = ParseDouble(values.substr(from, comma - from));
          if (!v || f >= channel->values.size()) Bad(at, "a channel without one value a frame");
          channel->values[f] = *v;
          from = comma + 1;
        }
        if (f != channel->values.size()) Bad(at, "a channel without one value a frame");
        for (f = 0; f < flags.size(); ++f) {
          if (flags[f] < '0' || flags[f] > '2') Bad(at, "a bad key flag");
          channel->keys[f] = flags[f] != '0', channel->selected[f] = flags[f] == '2';
        }
        channel->fallback = *fallback;
      }
    }
  }
  if (ids.empty()) Bad(at + 1, "no scene object");
  for (ObjectId id : ids)
    if (scene.objects.at(id).type == "Analog" && !scene.analog.column.contains(id)) Bad(at + 1, "an analog channel without samples");
  if (analog.samplesPerFrame > 0)
    scene.analog.data = c3d::AnalogData::FromChannels(analog.channels, analog.samplesPerFrame, static_cast<std::size_t>(frames));
  auto& selection = next("selection", 0, ids.size());
  for (std::size_t i = 1; i < selection.size(); ++i) {
    ObjectId id = ids[static_cast<std::size_t>(number(selection[i], 1, static_cast<long>(ids.size()) - 1))];
    if (std::find(scene.selection.begin(), scene.selection.end(), id) != scene.selection.end()) Bad(at, "an object selected twice");
    scene.selection.push_back(id);
  }
  if (auto& active = next("active", 1, 1); active[1] != "-") {
    Object& clip = scene.objects.at(ids[static_cast<std::size_t>(number(active[1], 1, static_cast<long>(ids.size()) - 1))]);
    if (clip.type != "Clip") Bad(at, "the active clip is not a clip");
    scene.activeClip = clip.id;
  }
  next("end", 0, 0);
  if (at != lines.size()) Bad(at + 1, "lines after the end");
  return scene;
}

}  // namespace client3::host
