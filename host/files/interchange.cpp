// Both formats carry the markers of the scene's subjects, each named `SUBJECT:MARKER`, frame by
// frame. Files are read whole and checked completely before the scene changes: a damaged,
// truncated or hostile file is refused and the scene stays as it was.
#include "host/files/interchange.h"

#include <algorithm>
#include <cctype>
#include <map>
#include <set>

#include "host/files/access.h"
#include "host/files/c3d.h"
#include "host/scene/failure.h"
#include "host/server/log.h"
#include "platform/files.h"

namespace client3::host {

namespace {

// The largest file that is imported, and the longest take.
constexpr std::uintmax_t kMaxImport = std::uintmax_t{1} << 30;
constexpr std::int64_t kMaxFrames = 1'000'000;
// The subject of a point whose label names no subject.
constexpr std::string_view kUnlabeled = "Unlabeled";

// ---- Trajectories, whatever the format -------------------------------------------------------------

struct Track {
  std::string subject, marker;
  std::vector<double> values[3];  // x, y, z per frame
  std::vector<bool> keys[3];      // whether each has a key
};

struct Take {
  std::int64_t frames = 0;
  double rate = 0;  // frames per second; 0 when the file does not say
  std::vector<Track> tracks;
};

constexpr const char* kAxes[] = {"X", "Y", "Z"};

// Splits `SUBJECT:MARKER` at its last colon; a label without one belongs to the unlabeled subject.
void NameTrack(Track& track, std::string_view label) {
  std::size_t colon = label.rfind(':');
  track.subject = colon == std::string_view::npos ? std::string(kUnlabeled) : std::string(label.substr(0, colon));
  track.marker = std::string(colon == std::string_view::npos ? label : label.substr(colon + 1));
}

// Every marker of every subject, in the order of the tree.
Take TakeOf(Scene& scene) {
  Take take;
  take.frames = scene.frames;
  take.rate = scene.timeline.rate;
  for (Object* subject : scene.OfType(scene.Root(), "Subject"))
    for (Object* marker : scene.OfType(*subject, "Marker")) {
      if (marker->name.find(':') != std::string::npos)
        Refuse("the marker '" + subject->name + "/" + marker->name + "' cannot be exported: a ':' in its name");
      Track track{subject->name, marker->name, {}, {}};
      for (int axis = 0; axis < 3; ++axis) {
        Channel* channel = marker->FindChannel(kAxes[axis]);
        track.values[axis] = channel->values;
        track.keys[axis] = channel->keys;
      }
      take.tracks.push_back(std::move(track));
    }
  return take;
}

// Writes the tracks into `scene`, making the subjects and markers that are missing.
void Apply(Scene& scene, Take& take) {
  scene.objects.reserve(scene.objects.size() + 2 * take.tracks.size());
  std::set<std::pair<std::string_view, std::string_view>> seen;
  for (Track& track : take.tracks) {
    auto refuse = [&](const std::string& why) { Refuse("the point '" + track.subject + ":" + track.marker + "' cannot be imported: " + why); };
    for (const std::string* name : {&track.subject, &track.marker})
      if (std::string why = BadName(*name); !why.empty()) refuse(why);
    if (!seen.insert({track.subject, track.marker}).second) refuse("the file holds it twice");
    Object* subject = scene.Child(scene.Root(), track.subject);
    if (!subject) subject = &scene.Add(scene.root, "Subject", track.subject);
    if (subject->type != "Subject") refuse("'" + track.subject + "' is a " + subject->type);
    Object* marker = scene.Child(*subject, track.marker);
    if (!marker) marker = &scene.Add(subject->id, "Marker", track.marker);
    if (marker->type != "Marker") refuse("'" + track.marker + "' is a " + marker->type);
    for (int axis = 0; axis < 3; ++axis) {
      Channel& channel = *marker->FindChannel(kAxes[axis]);
      channel.values = std::move(track.values[axis]);
      channel.keys = std::move(track.keys[axis]);
      channel.selected.assign(channel.keys.size(), false);
    }
  }
}

// ---- CSV ------------------------------------------------------------------------------------------

std::string CsvField(std::string_view text) {
  if (text.find_first_of(",\"\r\n") == std::string_view::npos) return std::string(text);
  std::string quoted = "\"";
  for (char c : text) quoted += c == '"' ? std::string("\"\"") : std::string(1, c);
  return quoted + "\"";
}

std::string WriteCsv(const Take& take) {
  std::string text = "Frame";
  for (const Track& track : take.tracks)
    for (const char* axis : kAxes) text += ',', text += CsvField(track.subject + ":" + track.marker + ":" + axis);
  text += "\n";
  for (std::int64_t frame = 0; frame < take.frames; ++frame) {
    text += std::to_string(frame + 1);
    auto f = static_cast<std::size_t>(frame);
    for (const Track& track : take.tracks)
      for (int axis = 0; axis < 3; ++axis) {
        text += ',';
        if (track.keys[axis][f]) text += NumberText(track.values[axis][f]);
      }
    text += "\n";
  }
  return text;
}

// Reads CSV text row by row: fields separated by commas, double quotes around a field that holds a
// comma, quote or line break (a quote inside written twice), rows ended by LF or CR LF.
class CsvReader {
public:
  explicit CsvReader(std::string_view text) : text_(text) {}
  int line() const { return line_; }
  bool done() const { return at_ >= text_.size(); }

  [[noreturn]] void Fail(const std::string& why) const {
    Refuse("the CSV file is damaged at line " + std::to_string(line_) + ": " + why);
  }

  std::vector<std::string> Row() {
    ++line_;
    std::vector<std::string> fields(1);
    while (at_ < text_.size()) {
      char c = text_[at_++];
      if (c == '"' && fields.back().empty() && !quotedField_) {
        Quoted(fields.back());
        quotedField_ = true;
      } else if (c == ',') {
        fields.emplace_back(), quotedField_ = false;
      } else if (c == '\n' || (c == '\r' && at_ < text_.size() && text_[at_] == '\n')) {
        if (c == '\r') ++at_;
        quotedField_ = false;
        return fields;
      } else if (quotedField_ || c == '"' || c == '\r') {
        Fail("a stray character after or inside a field");
      } else {
        fields.back() += c;
      }
    }
    Fail("the last line does not end");
  }

private:
  void Quoted(std::string& field) {
    int startLine = line_;
    while (at_ < text_.size()) {
      char c = text_[at_++];
      if (c == '"') {
        if (at_ < text_.size() && text_[at_] == '"') field += '"', ++at_;
        else return;
      } else {
        if (c == '\n') ++line_;
        field += c;
      }
    }
    line_ = startLine;
    Fail("a quoted field does not end");
  }

  std::string_view text_;
  std::size_t at_ = 0;
  int line_ = 0;
  bool quotedField_ = false;
};

Take ReadCsv(std::string_view text) {
  CsvReader csv(text);
  if (csv.done()) Refuse("the CSV file is damaged at line 1: the file is empty");
  std::vector<std::string> header = csv.Row();
  if (header[0] != "Frame") csv.Fail("the first column must be 'Frame'");
  if ((header.size() - 1) % 3 != 0) csv.Fail("the columns after 'Frame' must come in threes (X, Y, Z)");
  Take take;
  for (std::size_t column = 1; column < header.size(); column += 3) {
    std::string_view label;
    for (int axis = 0; axis < 3; ++axis) {
      std::string_view name = header[column + static_cast<std::size_t>(axis)];
      std::string suffix = std::string(":") + kAxes[axis];
      if (!name.ends_with(suffix) || (axis > 0 && name.substr(0, name.size() - 2) != label))
        csv.Fail("column " + std::to_string(column + static_cast<std::size_t>(axis) + 1) + " must be the " + kAxes[axis] +
                 " of a marker (SUBJECT:MARKER:" + kAxes[axis] + "): '" + std::string(name) + "'");
      if (axis == 0) label = name.substr(0, name.size() - 2);
    }
    Track track;
    NameTrack(track, label);
    take.tracks.push_back(std::move(track));
  }
  std::optional<std::int64_t> first;
  while (!csv.done()) {
    std::vector<std::string> row = csv.Row();
    if (row.size() != header.size())
      csv.Fail(std::to_string(row.size()) + " fields where the header has " + std::to_string(header.size()));
    auto frame = ParseInt(row[0]);
    if (!frame) csv.Fail("the frame '" + row[0] + "' is not a whole number");
    if (!first) first = *frame;
    if (*frame != *first + take.frames) csv.Fail("frame " + row[0] + " where frame " + std::to_string(*first + take.frames) + " should be");
    if (++take.frames > kMaxFrames) csv.Fail("more than " + std::to_string(kMaxFrames) + " frames");
    for (std::size_t i = 1; i < row.size(); ++i) {
      Track& track = take.tracks[(i - 1) / 3];
      int axis = static_cast<int>((i - 1) % 3);
      std::optional<double> value = row[i].empty() ? std::optional<double>(0) : ParseDouble(row[i]);
      if (!value) csv.Fail("'" + row[i] + "' is not a number");
      track.values[axis].push_back(*value);
      track.keys[axis].push_back(!row[i].empty());
    }
  }
  if (take.frames == 0) csv.Fail("the file has no frames");
  return take;
}

// ---- C3D: names, analog channels and kept groups ---------------------------------------------------

// `text` as UTF-8: itself when it is valid UTF-8, else read as Latin-1 (as older capture systems
// write their labels).
bool ValidUtf8(std::string_view text) {
  for (std::size_t i = 0; i < text.size(); ++i) {
    auto c = static_cast<unsigned char>(text[i]);
    std::size_t more = c < 0x80 ? 0 : c >= 0xc2 && c < 0xe0 ? 1 : c >= 0xe0 && c < 0xf0 ? 2 : c >= 0xf0 && c < 0xf5 ? 3 : 4;
    if (more == 4 || text.size() - i <= more) return false;
    auto second = static_cast<unsigned char>(more ? text[i + 1] : 0x80);
    if ((c == 0xe0 && second < 0xa0) || (c == 0xed && second > 0x9f) || (c == 0xf0 && second < 0x90) || (c == 0xf4 && second > 0x8f))
      return false;
    for (std::size_t k = 1; k <= more; ++k)
      if ((static_cast<unsigned char>(text[i + k]) & 0xc0) != 0x80) return false;
    i += more;
  }
  return true;
}

std::string Utf8(std::string_view text) {
  if (ValidUtf8(text)) return std::string(text);
  std::string out;
  for (char c : text) {
    auto byte = static_cast<unsigned char>(c);
    if (byte < 0x80) out += c;
    else out += static_cast<char>(0xc0 | byte >> 6), out += static_cast<char>(0x80 | (byte & 0x3f));
  }
  return out;
}

// A file's text as an object name: UTF-8, with '/' and control characters (which names cannot hold)
// turned into '_'.
std::string NameText(std::string_view text) {
  std::string name = Utf8(text);
  for (char& c : name)
    if (c == '/' || static_cast<unsigned char>(c) < 0x20) c = '_';
  return name;
}

// `base`, or where `taken` says it is taken, the first of base_2, base_3, ... that is not.
template <class Taken>
std::string Unique(const std::string& base, Taken taken) {
  if (!taken(base)) return base;
  for (int k = 2;; ++k)
    if (std::string name = base + "_" + std::to_string(k); !taken(name)) return name;
}

// The names of the file's points. A label is split at its last colon (SUBJECT:MARKER; without one,
// or with nothing before it, the subject is Unlabeled). A point whose label or marker part is blank
// is named Point<N>, N its number in the file. A name the file has already given gets the first free
// suffix _2, _3, ...; labelled points are named first, in the file's order, so the first occurrence
// of a label keeps it. Every renamed point is reported in `log`.
void NamePoints(Take& take, const std::vector<c3d::Point>& points, std::vector<std::string>& log) {
  std::set<std::pair<std::string_view, std::string_view>> taken;  // the names of take.tracks given so far
  for (int pass = 0; pass < 2; ++pass)
    for (std::size_t p = 0; p < points.size(); ++p) {
      std::string label = NameText(points[p].label);
      std::size_t colon = label.rfind(':');
      std::string subject = colon == std::string::npos || colon == 0 ? std::string(kUnlabeled) : label.substr(0, colon);
      std::string marker = colon == std::string::npos ? label : label.substr(colon + 1);
      if (marker.empty() != (pass == 1)) continue;
      std::string base = marker.empty() ? "Point" + std::to_string(p + 1) : marker;
      marker = Unique(base, [&](const std::string& name) { return taken.contains({subject, name}); });
      take.tracks[p].subject = subject, take.tracks[p].marker = marker;
      taken.insert({take.tracks[p].subject, take.tracks[p].marker});
      std::string named = " is named '" + subject + ":" + marker + "'";
      if (pass == 1) log.push_back("point " + std::to_string(p + 1) + " has no label: it" + named);
      else if (marker != base) log.push_back("the label '" + label + "' is repeated: its point " + std::to_string(p + 1) + named);
    }
}

// The file's points as tracks, seen where all three coordinates hold keys.
Take TracksOf(c3d::Take& file, std::vector<std::string>& log) {
  Take take;
  take.frames = static_cast<std::int64_t>(file.frames);
  take.rate = file.rate;
  take.tracks.resize(file.points.size());
  NamePoints(take, file.points, log);
  for (std::size_t p = 0; p < file.points.size(); ++p) {
    for (int axis = 0; axis < 3; ++axis) take.tracks[p].values[axis] = std::move(file.points[p].axis[axis]);
    take.tracks[p].keys[0] = take.tracks[p].keys[1] = file.points[p].seen;
    take.tracks[p].keys[2] = std::move(file.points[p].seen);
  }
  return take;
}

// The file's analog channels become the take's, each an Analog object under the root named by its
// label (Analog<N> where it has none; a name taken under the root gets a suffix as points do), and
// the file's other groups are kept. A merge keeps the take's own when the file brings no channels;
// the take's channels are dropped (DropAnalog) before the file's markers come in.
bool ReplacesAnalog(const c3d::Take& file, bool merge) { return !merge || !file.analog.empty(); }

void DropAnalog(Scene& scene) {
  for (Object* old : scene.OfType(scene.Root(), "Analog")) scene.Remove(old->id);
}

void AddAnalog(Scene& scene, c3d::Take& file, std::vector<std::string>& log) {
  scene.analog = {file.samples, file.generalScale, {}};
  scene.fileGroups = std::move(file.groups);
  for (std::size_t c = 0; c < file.analog.size(); ++c) {
    c3d::Analog& channel = file.analog[c];
    std::string base = channel.label.empty() ? "Analog" + std::to_string(c + 1) : NameText(channel.label);
    std::string name = Unique(base, [&](const std::string& n) { return scene.Child(scene.Root(), n) != nullptr; });
    if (name != base) log.push_back("the analog channel '" + base + "' (" + std::to_string(c + 1) + ") is named '" + name + "'");
    Object& o = scene.Add(scene.root, "Analog", name);
    o.FindAttribute("Description")->value = Utf8(channel.description);
    o.FindAttribute("Unit")->value = Utf8(channel.unit);
    o.FindAttribute("Scale")->value = *Canonical(ValueType::Float, FloatText(channel.scale));
    o.FindAttribute("Offset")->value = *Canonical(ValueType::Float, FloatText(channel.offset));
    scene.analog.column[o.id] = channel.column;
  }
}

// The take as a C3D file holds it: its markers, its analog channels in the order of the tree, and the
// kept groups.
c3d::Take C3dOf(Scene& scene, Take& take) {
  c3d::Take file;
  file.rate = take.rate;
  file.frames = static_cast<std::size_t>(take.frames);
  for (Track& track : take.tracks) {
    c3d::Point& point = file.points.emplace_back();
    point.label = track.subject + ":" + track.marker;
    point.seen.resize(file.frames);
    for (std::size_t f = 0; f < file.frames; ++f) point.seen[f] = track.keys[0][f] && track.keys[1][f] && track.keys[2][f];
    for (int axis = 0; axis < 3; ++axis) point.axis[axis] = std::move(track.values[axis]);
  }
  file.samples = scene.analog.data;
  file.generalScale = scene.analog.generalScale;
  for (Object* o : scene.OfType(scene.Root(), "Analog"))
    file.analog.push_back({o->name, o->Text("Description"), o->Text("Unit"), ParseDouble(o->Text("Scale")).value_or(1),
                           ParseDouble(o->Text("Offset")).value_or(0), scene.analog.column.at(o->id)});
  file.groups = scene.fileGroups;
  return file;
}

// ---- Files ----------------------------------------------------------------------------------------

enum class Format { Csv, C3d };

Format FormatOf(const std::string& path, std::string_view name) {
  std::string lower;
  if (name.empty()) {
    std::size_t dot = path.rfind('.');
    name = dot == std::string::npos ? std::string_view() : std::string_view(path).substr(dot + 1);
    if (name.find_first_of("/\\") != std::string_view::npos) name = {};
  }
  for (char c : name) lower += static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  if (lower == "csv") return Format::Csv;
  if (lower == "c3d") return Format::C3d;
  Refuse("no file format '" + std::string(name) + "' (csv or c3d) for '" + path + "'");
}

std::string StemOf(const std::string& path) {
  std::size_t slash = path.find_last_of("/\\");
  std::string name = path.substr(slash == std::string::npos ? 0 : slash + 1);
  std::size_t dot = name.rfind('.');
  if (dot != std::string::npos && dot > 0) name.resize(dot);
  return BadName(name).empty() ? name : "Untitled";
}

}  // namespace

Scene Imported(const Scene& scene, const std::string& path, std::string_view formatName, bool merge) {
  Format format = FormatOf(path, formatName);
  std::string bytes;
  if (!platform::ReadFile(FilePlace(path), bytes, kMaxImport)) Refuse("cannot read the file '" + path + "'");
  std::vector<std::string> log;
  c3d::Take file;
  if (format == Format::C3d) file = c3d::Read(std::move(bytes)), log = file.notes;
  Take take = format == Format::Csv ? ReadCsv(bytes) : TracksOf(file, log);
  bytes.clear();

  if (merge && take.frames != scene.frames)
    Refuse("the file has " + std::to_string(take.frames) + " frames and the take " + std::to_string(scene.frames) +
           ": a merge needs the same number");
  Scene next = merge ? scene : EmptyScene(static_cast<int>(take.frames));
  if (!merge) {
    double rate = format == Format::Csv ? scene.timeline.rate : take.rate;
    if (!TimelineHolds(rate)) Refuse("the file's frame rate " + NumberText(rate) + " is not one the timeline supports");
    next.Root().name = StemOf(path);
    next.timeline.rate = rate;
    next.timeline.standard = scene.timeline.standard;
  }
  bool analog = format == Format::C3d && ReplacesAnalog(file, merge);
  if (analog) DropAnalog(next);
  Apply(next, take);
  if (analog) AddAnalog(next, file, log);
  for (const std::string& line : log) LogLine("warning", "ImportFile '" + path + "': " + line);
  return next;
}

void Export(Scene& scene, const std::string& path, std::string_view formatName) {
  Format format = FormatOf(path, formatName);
  Take take = TakeOf(scene);
  std::string bytes = format == Format::Csv ? WriteCsv(take) : c3d::Write(C3dOf(scene, take));
  if (!platform::WriteFileAtomically(FilePlace(path), bytes)) Refuse("cannot write the file '" + path + "'");
}

}  // namespace client3::host
