// Importing and exporting trajectories: CSV text (one row per frame) and C3D point data.
//
// Both formats carry the markers of the scene's subjects, each named `SUBJECT:MARKER`, frame by
// frame. Files are read whole and checked completely before the scene changes: a damaged,
// truncated or hostile file is refused and the scene stays as it was.
//
// C3D files are written in the Intel floating-point form: a 512-byte header block, the parameter
// blocks (groups POINT, ANALOG and TRIAL), then for each frame four 32-bit floats per point (x, y,
// z and a word that is -1 where the point was not seen). Reading accepts the Intel form with float
// or scaled 16-bit integer data, with or without analog samples (which are read past).
#include <algorithm>
#include <bit>
#include <cctype>
#include <cmath>
#include <cstring>
#include <limits>
#include <map>

#include "host/access.h"
#include "host/handlers.h"
#include "platform/files.h"

namespace client3::host {

using protocol::Id;
using protocol::Reader;
using protocol::Writer;

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
  std::map<std::pair<std::string, std::string>, bool> seen;
  for (Track& track : take.tracks) {
    std::string label = track.subject + ":" + track.marker;
    for (const std::string& name : {track.subject, track.marker})
      if (std::string why = BadName(name); !why.empty()) Refuse("the point '" + label + "' cannot be imported: " + why);
    if (seen[{track.subject, track.marker}]) Refuse("the point '" + label + "' cannot be imported: the file holds it twice");
    seen[{track.subject, track.marker}] = true;
    Object* subject = scene.Child(scene.Root(), track.subject);
    if (!subject) subject = &scene.Add(scene.root, "Subject", track.subject);
    if (subject->type != "Subject") Refuse("the point '" + label + "' cannot be imported: '" + track.subject + "' is a " + subject->type);
    Object* marker = scene.Child(*subject, track.marker);
    if (!marker) marker = &scene.Add(subject->id, "Marker", track.marker);
    if (marker->type != "Marker") Refuse("the point '" + label + "' cannot be imported: '" + track.marker + "' is a " + marker->type);
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

// ---- C3D ------------------------------------------------------------------------------------------

constexpr std::size_t kBlock = 512;
constexpr std::uint8_t kKey = 0x50;
constexpr std::uint8_t kIntel = 84;
constexpr std::size_t kMaxLabel = 255;  // a dimension is one byte

template <class T>
void PutLe(std::string& out, T value) {
  auto bits = std::bit_cast<std::conditional_t<sizeof(T) == 2, std::uint16_t, std::uint32_t>>(value);
  for (std::size_t i = 0; i < sizeof(T); ++i) out += static_cast<char>((bits >> (8 * i)) & 0xff);
}

template <class T>
T GetLe(std::string_view bytes, std::size_t at) {
  using Bits = std::conditional_t<sizeof(T) == 1, std::uint8_t, std::conditional_t<sizeof(T) == 2, std::uint16_t, std::uint32_t>>;
  Bits bits = 0;
  for (std::size_t i = 0; i < sizeof(T); ++i) bits = static_cast<Bits>(bits | static_cast<Bits>(static_cast<std::uint8_t>(bytes[at + i])) << (8 * i));
  return std::bit_cast<T>(bits);
}

void Pad(std::string& out) { out.resize((out.size() + kBlock - 1) / kBlock * kBlock, '\0'); }

// The parameter section: groups, each followed by its parameters.
class ParameterWriter {
public:
  void Group(std::int8_t id, std::string_view name) {
    Item(static_cast<std::int8_t>(-id), name, std::string(1, '\0'));  // no description
  }
  void Int16s(std::int8_t group, std::string_view name, const std::vector<std::uint16_t>& values) {
    std::string body{static_cast<char>(2)};
    Dimensions(body, values.size() == 1 ? std::vector<std::size_t>{} : std::vector<std::size_t>{values.size()});
    for (std::uint16_t v : values) PutLe(body, v);
    Item(group, name, body + '\0');
  }
  void Float(std::int8_t group, std::string_view name, float value) {
    std::string body{static_cast<char>(4), '\0'};
    PutLe(body, value);
    Item(group, name, body + '\0');
  }
  // Texts padded with blanks to the longest; split into NAME, NAME2, NAME3... so that no
  // dimension exceeds a byte and no parameter exceeds what its offset word can skip.
  void Texts(std::int8_t group, std::string_view name, const std::vector<std::string>& texts) {
    std::size_t width = 1;
    for (const std::string& t : texts) width = std::max(width, t.size());
    std::size_t per = std::min<std::size_t>(255, 30000 / width);
    std::size_t part = 0;
    for (std::size_t from = 0; from < texts.size() || part == 0; from += per) {
      std::size_t count = std::min(per, texts.size() - std::min(from, texts.size()));
      std::string body{static_cast<char>(-1)};
      Dimensions(body, {width, count});
      for (std::size_t i = from; i < from + count; ++i) body += texts[i] + std::string(width - texts[i].size(), ' ');
      Item(group, std::string(name) + (part ? std::to_string(part + 1) : ""), body + '\0');
      ++part;
    }
  }
  void Text(std::int8_t group, std::string_view name, std::string_view text) {
    std::string body{static_cast<char>(-1)};
    Dimensions(body, {text.size()});
    Item(group, name, body + std::string(text) + '\0');
  }
  // The section with its four-byte heading, padded to whole blocks; the last item's offset is 0.
  std::string Finish() {
    std::size_t blocks = (4 + items_.size() + kBlock - 1) / kBlock;
    if (blocks > 255) Refuse("too many markers for a C3D file");
    if (last_ != std::string::npos) items_[last_] = items_[last_ + 1] = '\0';
    std::string out{'\x01', static_cast<char>(kKey), static_cast<char>(blocks), static_cast<char>(kIntel)};
    out += items_;
    Pad(out);
    return out;
  }

private:
  static void Dimensions(std::string& body, const std::vector<std::size_t>& dims) {
    body += static_cast<char>(dims.size());
    for (std::size_t d : dims) body += static_cast<char>(d);
  }
  void Item(std::int8_t id, std::string_view name, const std::string& body) {
    items_ += static_cast<char>(name.size());
    items_ += static_cast<char>(id);
    items_ += name;
    last_ = items_.size();
    PutLe(items_, static_cast<std::uint16_t>(body.size() + 2));
    items_ += body;
  }
  std::string items_;
  std::size_t last_ = std::string::npos;
};

std::string WriteC3d(const Take& take) {
  if (take.tracks.size() > 65535) Refuse("too many markers for a C3D file");
  std::vector<std::string> labels;
  for (const Track& track : take.tracks) {
    labels.push_back(track.subject + ":" + track.marker);
    if (labels.back().size() > kMaxLabel) Refuse("the label '" + labels.back() + "' is longer than a C3D file allows");
  }
  auto frames = static_cast<std::uint32_t>(take.frames);
  auto shortFrames = static_cast<std::uint16_t>(std::min<std::uint32_t>(frames, 65535));
  auto rate = static_cast<float>(take.rate);
  enum : std::int8_t { kPoint = 1, kAnalog = 2, kTrial = 3 };

  // The data start depends on the parameter section's size, which does not depend on its value.
  auto parameters = [&](std::uint16_t dataBlock) {
    ParameterWriter p;
    p.Group(kPoint, "POINT");
    p.Int16s(kPoint, "USED", {static_cast<std::uint16_t>(labels.size())});
    p.Int16s(kPoint, "FRAMES", {shortFrames});
    p.Int16s(kPoint, "DATA_START", {dataBlock});
    p.Float(kPoint, "SCALE", -1.0f);
    p.Float(kPoint, "RATE", rate);
    p.Text(kPoint, "UNITS", "mm");
    p.Texts(kPoint, "LABELS", labels);
    p.Texts(kPoint, "DESCRIPTIONS", std::vector<std::string>(labels.size(), ""));
    if (frames >= 65535) p.Float(kPoint, "LONG_FRAMES", static_cast<float>(frames));
    p.Group(kAnalog, "ANALOG");
    p.Int16s(kAnalog, "USED", {0});
    p.Float(kAnalog, "RATE", 0.0f);
    p.Float(kAnalog, "GEN_SCALE", 1.0f);
    p.Group(kTrial, "TRIAL");
    p.Int16s(kTrial, "ACTUAL_START_FIELD", {1, 0});
    p.Int16s(kTrial, "ACTUAL_END_FIELD", {static_cast<std::uint16_t>(frames & 0xffff), static_cast<std::uint16_t>(frames >> 16)});
    return p.Finish();
  };
  std::string section = parameters(0);
  auto dataBlock = static_cast<std::uint16_t>(2 + section.size() / kBlock);
  section = parameters(dataBlock);

  std::string out;
  out += '\x02', out += static_cast<char>(kKey);
  PutLe(out, static_cast<std::uint16_t>(labels.size()));
  PutLe(out, std::uint16_t{0});  // analog values per frame
  PutLe(out, std::uint16_t{1});  // first frame
  PutLe(out, shortFrames);       // last frame (TRIAL:ACTUAL_END_FIELD beyond 65535)
  PutLe(out, std::uint16_t{0});  // largest gap filled
  PutLe(out, -1.0f);             // scale: negative for float data
  PutLe(out, dataBlock);
  PutLe(out, std::uint16_t{0});  // analog samples per frame
  PutLe(out, rate);
  Pad(out);
  out += section;
  out.reserve(out.size() + static_cast<std::size_t>(frames) * labels.size() * 16 + kBlock);
  for (std::size_t f = 0; f < frames; ++f)
    for (const Track& track : take.tracks) {
      bool seen = track.keys[0][f] && track.keys[1][f] && track.keys[2][f];
      for (int axis = 0; axis < 3; ++axis) {
        double value = seen ? track.values[axis][f] : 0.0;
        if (!(std::fabs(value) <= std::numeric_limits<float>::max()))
          Refuse("the marker '" + track.subject + ":" + track.marker + "' holds " + NumberText(value) + ", too large for a C3D file");
        PutLe(out, static_cast<float>(value));
      }
      PutLe(out, seen ? 0.0f : -1.0f);
    }
  Pad(out);
  return out;
}

struct C3dParameter {
  std::int8_t group;
  std::string name;
  std::int8_t type;  // -1 text, 1 byte, 2 16-bit integer, 4 float
  std::vector<std::size_t> dims;
  std::string_view data;
};

class C3dReader {
public:
  explicit C3dReader(std::string_view file) : file_(file) {}

  [[noreturn]] static void Fail(const std::string& why) { Refuse("the C3D file is damaged: " + why); }

  Take Read() {
    if (file_.size() < kBlock || static_cast<std::uint8_t>(file_[1]) != kKey) Fail("it does not start with a C3D header");
    ReadParameters();
    std::size_t points = GetLe<std::uint16_t>(file_, 2);
    std::size_t analogs = GetLe<std::uint16_t>(file_, 4);
    std::int64_t first = GetLe<std::uint16_t>(file_, 6), last = GetLe<std::uint16_t>(file_, 8);
    float scale = GetLe<float>(file_, 12);
    std::size_t dataBlock = GetLe<std::uint16_t>(file_, 16);
    float rate = GetLe<float>(file_, 20);
    if (const C3dParameter* start = Find("TRIAL", "ACTUAL_START_FIELD"); start && start->type == 2 && Count(*start) == 2)
      first = Word(*start, 0) + 65536 * Word(*start, 1);
    if (const C3dParameter* end = Find("TRIAL", "ACTUAL_END_FIELD"); end && end->type == 2 && Count(*end) == 2)
      last = std::max(last, Word(*end, 0) + 65536 * Word(*end, 1));
    if (last < first) Fail("its last frame comes before its first");
    if (last - first + 1 > kMaxFrames) Fail("it has more than " + std::to_string(kMaxFrames) + " frames");
    if (!std::isfinite(scale) || scale == 0) Fail("its scale factor is not a number other than 0");
    if (!std::isfinite(rate) || rate <= 0) Fail("its frame rate is not a positive number");
    if (dataBlock < 2) Fail("its data start in block " + std::to_string(dataBlock));

    Take take;
    take.frames = last - first + 1;
    take.rate = rate;
    std::vector<std::string> labels = Labels(points);
    bool floats = scale < 0;
    std::size_t word = floats ? 4 : 2;
    std::size_t frameBytes = (points * 4 + analogs) * word;
    std::size_t start = (dataBlock - 1) * kBlock;
    auto frames = static_cast<std::size_t>(take.frames);
    if (start > file_.size() || (file_.size() - start) / std::max<std::size_t>(frameBytes, 1) < (frameBytes ? frames : 0))
      Fail("it ends before its last frame");

    take.tracks.resize(points);
    for (std::size_t p = 0; p < points; ++p) {
      NameTrack(take.tracks[p], labels[p]);
      for (int axis = 0; axis < 3; ++axis) take.tracks[p].values[axis].assign(frames, 0), take.tracks[p].keys[axis].assign(frames, false);
    }
    for (std::size_t f = 0; f < frames; ++f)
      for (std::size_t p = 0; p < points; ++p) {
        std::size_t at = start + f * frameBytes + p * 4 * word;
        double xyz[3];
        double residual;
        for (int axis = 0; axis < 3; ++axis)
          xyz[axis] = floats ? GetLe<float>(file_, at + static_cast<std::size_t>(axis) * word)
                             : GetLe<std::int16_t>(file_, at + static_cast<std::size_t>(axis) * word) * static_cast<double>(scale);
        residual = floats ? GetLe<float>(file_, at + 3 * word) : GetLe<std::int16_t>(file_, at + 3 * word);
        bool seen = residual >= 0 && std::isfinite(xyz[0]) && std::isfinite(xyz[1]) && std::isfinite(xyz[2]);
        if (!seen) continue;
        for (int axis = 0; axis < 3; ++axis) take.tracks[p].values[axis][f] = xyz[axis], take.tracks[p].keys[axis][f] = true;
      }
    return take;
  }

private:
  void ReadParameters() {
    std::size_t block = static_cast<std::uint8_t>(file_[0]);
    if (block < 2) Fail("its parameters start in block " + std::to_string(block));
    std::size_t start = (block - 1) * kBlock;
    if (start + 4 > file_.size()) Fail("it ends before its parameters");
    std::uint8_t processor = static_cast<std::uint8_t>(file_[start + 3]);
    if (processor != kIntel) Fail("only the Intel form is read, not processor type " + std::to_string(processor));
    std::size_t end = std::min(file_.size(), start + kBlock * static_cast<std::uint8_t>(file_[start + 2]));
    std::size_t at = start + 4;
    while (at + 2 <= end) {
      auto length = static_cast<std::int8_t>(file_[at]);
      auto id = static_cast<std::int8_t>(file_[at + 1]);
      if (length == 0 || id == 0) break;
      std::size_t nameLength = static_cast<std::size_t>(std::abs(length));
      if (at + 2 + nameLength + 2 > end) Fail("a parameter runs past the parameter section");
      std::string name(file_.substr(at + 2, nameLength));
      for (char& c : name) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
      std::size_t offsetAt = at + 2 + nameLength;
      std::size_t offset = GetLe<std::uint16_t>(file_, offsetAt);
      std::size_t next = offset == 0 ? end : offsetAt + offset;
      if (next > end || next < offsetAt + 2) Fail("a parameter's length points outside the parameter section");
      std::string_view body = file_.substr(offsetAt + 2, next - offsetAt - 2);
      if (id < 0) groups_[-id] = name;
      else parameters_.push_back(Parameter(id, std::move(name), body));
      if (offset == 0) break;
      at = next;
    }
  }

  static C3dParameter Parameter(std::int8_t group, std::string name, std::string_view body) {
    if (body.size() < 2) Fail("the parameter '" + name + "' is cut short");
    C3dParameter p{group, std::move(name), static_cast<std::int8_t>(body[0]), {}, {}};
    if (p.type != -1 && p.type != 1 && p.type != 2 && p.type != 4) Fail("the parameter '" + p.name + "' has an unknown type");
    std::size_t dims = static_cast<std::uint8_t>(body[1]);
    if (body.size() < 2 + dims) Fail("the parameter '" + p.name + "' is cut short");
    std::size_t size = static_cast<std::size_t>(std::abs(p.type));
    for (std::size_t i = 0; i < dims; ++i) {
      p.dims.push_back(static_cast<std::uint8_t>(body[2 + i]));
      size *= p.dims.back();
    }
    if (body.size() < 2 + dims + size) Fail("the parameter '" + p.name + "' is cut short");
    p.data = body.substr(2 + dims, size);
    return p;
  }

  const C3dParameter* Find(std::string_view group, std::string_view name) const {
    for (const C3dParameter& p : parameters_) {
      auto g = groups_.find(p.group);
      if (g != groups_.end() && g->second == group && p.name == name) return &p;
    }
    return nullptr;
  }
  static std::size_t Count(const C3dParameter& p) { return p.data.size() / static_cast<std::size_t>(std::abs(p.type)); }
  static std::int64_t Word(const C3dParameter& p, std::size_t i) { return GetLe<std::uint16_t>(p.data, 2 * i); }

  // POINT:LABELS, LABELS2, ... with their padding blanks taken off.
  std::vector<std::string> Labels(std::size_t points) const {
    std::vector<std::string> labels;
    for (int part = 1; labels.size() < points; ++part) {
      const C3dParameter* p = Find("POINT", part == 1 ? std::string("LABELS") : "LABELS" + std::to_string(part));
      if (!p) Fail("it names " + std::to_string(labels.size()) + " of its " + std::to_string(points) + " points");
      if (p->type != -1 || p->dims.size() != 2 || p->dims[0] == 0 || p->dims[1] == 0) Fail("its point labels are not a list of texts");
      for (std::size_t i = 0; i < p->dims[1] && labels.size() < points; ++i) {
        std::string_view label = p->data.substr(i * p->dims[0], p->dims[0]);
        std::size_t kept = label.find_last_not_of(std::string_view(" \0", 2));
        labels.emplace_back(label.substr(0, kept == std::string_view::npos ? 0 : kept + 1));
      }
    }
    return labels;
  }

  std::string_view file_;
  std::map<int, std::string> groups_;
  std::vector<C3dParameter> parameters_;
};

// ---- The commands ---------------------------------------------------------------------------------

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

// ImportFile(path, format, merge): merge true writes the file's markers into the scene, false
// replaces the scene with a new one holding the file's subjects and markers.
void ImportFile(Context& context, Reader& in, Writer&) {
  std::string path(in.Text());
  std::string_view formatName = in.Text();
  bool merge = in.Get<bool>();
  if (path.empty()) Refuse("a file path cannot be empty");
  Format format = FormatOf(path, formatName);
  std::string bytes;
  if (!platform::ReadFile(FilePlace(path), bytes, kMaxImport)) Refuse("cannot read the file '" + path + "'");
  Take take = format == Format::Csv ? ReadCsv(bytes) : C3dReader(bytes).Read();
  bytes.clear();

  if (merge && take.frames != context.scene.frames)
    Refuse("the file has " + std::to_string(take.frames) + " frames and the take " + std::to_string(context.scene.frames) +
           ": a merge needs the same number");
  Scene next = merge ? context.scene : EmptyScene(static_cast<int>(take.frames));
  if (!merge) {
    double rate = format == Format::Csv ? context.scene.timeline.rate : take.rate;
    if (!SupportedFrameRate(rate)) Refuse("the file's frame rate " + NumberText(rate) + " is not one the timeline supports");
    next.Root().name = StemOf(path);
    next.timeline.rate = static_cast<int>(rate);
    next.timeline.standard = context.scene.timeline.standard;
  }
  Apply(next, take);
  context.scene = std::move(next);
}

void ExportFile(Context& context, Reader& in, Writer&) {
  std::string path(in.Text());
  std::string_view formatName = in.Text();
  if (path.empty()) Refuse("a file path cannot be empty");
  Format format = FormatOf(path, formatName);
  Take take = TakeOf(context.scene);
  std::string bytes = format == Format::Csv ? WriteCsv(take) : WriteC3d(take);
  if (!platform::WriteFileAtomically(FilePlace(path), bytes)) Refuse("cannot write the file '" + path + "'");
}

constexpr HandlerEntry kHandlers[] = {
    {Id::ImportFile, &ImportFile},
    {Id::ExportFile, &ExportFile},
};

}  // namespace

std::span<const HandlerEntry> InterchangeHandlers() { return kHandlers; }

}  // namespace client3::host
