// Reading and writing C3D files (see c3d.h; the rules are on the reference page's C3D section).
#include "host/files/c3d.h"

#include <algorithm>
#include <bit>
#include <charconv>
#include <cmath>
#include <cstring>
#include <limits>
#include <map>
#include <optional>

#include "host/scene/failure.h"

namespace client3::host::c3d {

namespace {

constexpr std::size_t kBlock = 512;
constexpr std::uint8_t kKey = 0x50;
constexpr std::size_t kMaxFrames = 1'000'000;

[[noreturn]] void Damaged(const std::string& why) { Refuse("the C3D file is damaged: " + why); }

std::string Shortest(double value) {
  char text[32];
  return std::string(text, std::to_chars(text, text + sizeof text, value).ptr);
}

// `text` when it is printable ASCII, else a description that holds none of its bytes.
std::string Shown(std::string_view text) {
  for (char c : text)
    if (c < 0x20 || c > 0x7e) return "(text that is not printable)";
  return std::string(text);
}

// ---- Numbers in the three forms -------------------------------------------------------------------

std::uint16_t Load16(const char* p, bool big) {
  auto b0 = static_cast<std::uint8_t>(p[0]), b1 = static_cast<std::uint8_t>(p[1]);
  return static_cast<std::uint16_t>(big ? b0 << 8 | b1 : b1 << 8 | b0);
}

std::uint32_t Load32(const char* p, bool big) {
  std::uint32_t high = Load16(p, big), low = Load16(p + 2, big);
  return big ? high << 16 | low : low << 16 | high;
}

// A DEC single-precision float from the little-endian reading of its four bytes: its two 16-bit words
// swapped give sign, exponent and fraction as IEEE lays them out, and the value is the IEEE one over 4
// (DEC's hidden bit stands after the point). Exponent 0 is zero, or DEC's reserved operand (NaN).
float DecFloat(std::uint32_t stored) {
  std::uint32_t bits = stored << 16 | stored >> 16;
  std::uint32_t exponent = bits >> 23 & 0xff;
  if (exponent == 0) return bits >> 31 ? std::numeric_limits<float>::quiet_NaN() : 0.0f;
  if (exponent > 2) return std::bit_cast<float>(bits - (2u << 23));
  float magnitude = std::ldexp(static_cast<float>((bits & 0x7fffff) | 0x800000), static_cast<int>(exponent) - 152);
  return bits >> 31 ? -magnitude : magnitude;
}

template <Form F>
float Real(const char* p) {
  if constexpr (F == Form::Dec) return DecFloat(Load32(p, false));
  return std::bit_cast<float>(Load32(p, F == Form::Mips));
}

float RealOf(const char* p, Form form) {
  return form == Form::Dec ? Real<Form::Dec>(p) : form == Form::Mips ? Real<Form::Mips>(p) : Real<Form::Intel>(p);
}

void Store16(std::string& out, std::uint16_t value) {
  out += static_cast<char>(value & 0xff);
  out += static_cast<char>(value >> 8);
}

void Store32(char* at, std::uint32_t bits) {
  for (int i = 0; i < 4; ++i) at[i] = static_cast<char>(bits >> (8 * i) & 0xff);
}

void StoreFloat(std::string& out, float value) {
  char bytes[4];
  Store32(bytes, std::bit_cast<std::uint32_t>(value));
  out.append(bytes, 4);
}

// ---- The header ----------------------------------------------------------------------------------

struct Header {
  std::size_t parameterBlock = 0, points = 0, analogWords = 0, first = 0, last = 0, dataBlock = 0, samplesPerFrame = 0;
  double scale = 0, rate = 0;
};

Header ReadHeader(std::string_view file, Form form) {
  bool big = form == Form::Mips;
  auto word = [&](std::size_t number) -> std::size_t { return Load16(file.data() + 2 * (number - 1), big); };
  Header h;
  h.parameterBlock = static_cast<std::uint8_t>(file[0]);
  h.points = word(2), h.analogWords = word(3), h.first = word(4), h.last = word(5);
  h.scale = RealOf(file.data() + 12, form);
  h.dataBlock = word(9), h.samplesPerFrame = word(10);
  h.rate = RealOf(file.data() + 20, form);
  return h;
}

// ---- The parameter section -----------------------------------------------------------------------

// The groups and parameters of the section from `begin` to `end`, their numbers turned to the
// Intel form. Items follow each other by their offsets; an offset of 0, or one that points past
// the section, makes its item the last.
class Parameters {
 public:
  Parameters(std::string_view file, std::size_t begin, std::size_t end, Form form) : form_(form) {
    for (std::size_t at = begin; at + 2 <= end;) {
      auto length = static_cast<std::int8_t>(file[at]);
      auto id = static_cast<std::int8_t>(file[at + 1]);
      if (length == 0 || id == 0) break;
      std::size_t nameLength = static_cast<std::size_t>(std::abs(length));
      if (at + 4 + nameLength > end) Damaged("an item runs past the parameter section");
      std::string name = Name(file.substr(at + 2, nameLength));
      std::size_t offsetAt = at + 2 + nameLength;
      std::size_t offset = Load16(file.data() + offsetAt, form == Form::Mips);
      bool last = offset == 0 || offsetAt + offset > end;
      if (!last && offset < 2) Damaged("the item '" + name + "' points back into itself");
      std::string_view body = file.substr(offsetAt + 2, (last ? end : offsetAt + offset) - offsetAt - 2);
      if (id < 0) Describe(groups_[-id], std::move(name), body);
      else Add(id, std::move(name), body);
      if (last) break;
      at = offsetAt + offset;
    }
  }

  const Parameter* Find(std::string_view group, std::string_view name) const {
    for (const auto& [id, g] : groups_)
      if (g.name == group)
        for (const Parameter& p : g.parameters)
          if (p.name == name) return &p;
    return nullptr;
  }

  // The groups that the application does not write itself, in the order of their numbers.
  std::vector<Group> Others() const {
    std::vector<Group> out;
    for (const auto& [id, g] : groups_)
      if (!g.name.empty() && !OwnGroup(g.name)) out.push_back(g);
    return out;
  }

 private:
  // Names are upper-cased; a name that is not printable text is damage, not a name.
  static std::string Name(std::string_view bytes) {
    if (!ValidName(bytes)) Damaged("an item of its parameter section has a name that is not printable text");
    std::string name;
    for (char c : bytes) name += static_cast<char>(c >= 'a' && c <= 'z' ? c - 'a' + 'A' : c);
    return name;
  }

  static void Describe(Group& group, std::string name, std::string_view body) {
    group.name = std::move(name);
    std::size_t length = body.empty() ? 0 : static_cast<std::uint8_t>(body[0]);
    group.description = std::string(body.substr(std::min<std::size_t>(1, body.size()), length));
  }

  void Add(int group, std::string name, std::string_view body) {
    Parameter p;
    p.name = std::move(name);
    if (body.size() < 2) Damaged("the parameter '" + p.name + "' is cut short");
    p.type = static_cast<std::int8_t>(body[0]);
    if (p.type != -1 && p.type != 1 && p.type != 2 && p.type != 4)
      Damaged("the parameter '" + p.name + "' has the unknown type " + std::to_string(p.type));
    std::size_t dims = static_cast<std::uint8_t>(body[1]);
    std::size_t size = static_cast<std::size_t>(std::abs(p.type));
    for (std::size_t i = 0; i < dims; ++i) {
      if (2 + i >= body.size()) Damaged("the parameter '" + p.name + "' is cut short");
      p.dims.push_back(static_cast<std::uint8_t>(body[2 + i]));
      size = std::min<std::size_t>(size * p.dims.back(), std::size_t{1} << 40);  // no overflow; later 0s still count
    }
    std::size_t at = 2 + dims;
    if (size > body.size() || body.size() < at + size) Damaged("the parameter '" + p.name + "' is cut short");
    p.data = Intel(body.substr(at, size), p.type);
    at += size;
    std::size_t described = at < body.size() ? static_cast<std::uint8_t>(body[at]) : 0;
    p.description = std::string(body.substr(std::min(at + 1, body.size()), described));
    groups_[group].parameters.push_back(std::move(p));
  }

  std::string Intel(std::string_view data, int type) const {
    std::string out(data);
    if (form_ == Form::Intel || type == -1 || type == 1) return out;
    for (std::size_t i = 0; i + static_cast<std::size_t>(type) <= out.size(); i += static_cast<std::size_t>(type)) {
      if (type == 2) out[i] = data[i + (form_ == Form::Mips)], out[i + 1] = data[i + (form_ != Form::Mips)];
      else Store32(&out[i], std::bit_cast<std::uint32_t>(RealOf(data.data() + i, form_)));
    }
    return out;
  }

  Form form_;
  std::map<int, Group> groups_;
};

// The numbers of a parameter: bytes, 16-bit integers (unsigned, or signed when `signedWords`) or floats.
std::vector<double> Numbers(const Parameter* p, bool signedWords = false) {
  std::vector<double> out;
  if (!p || p->type == -1) return out;
  for (std::size_t i = 0; i + static_cast<std::size_t>(p->type) <= p->data.size(); i += static_cast<std::size_t>(p->type)) {
    const char* at = p->data.data() + i;
    if (p->type == 1) out.push_back(static_cast<std::uint8_t>(*at));
    else if (p->type == 2) out.push_back(signedWords ? static_cast<std::int16_t>(Load16(at, false)) : Load16(at, false));
    else out.push_back(std::bit_cast<float>(Load32(at, false)));
  }
  return out;
}

std::optional<double> Number(const Parameter* p) {
  std::vector<double> all = Numbers(p);
  if (all.empty() || !std::isfinite(all[0])) return std::nullopt;
  return all[0];
}

std::string Trimmed(std::string_view text) {
  constexpr std::string_view blank(" \0", 2);
  std::size_t from = text.find_first_not_of(blank);
  if (from == std::string_view::npos) return {};
  return std::string(text.substr(from, text.find_last_not_of(blank) - from + 1));
}

// The texts of a parameter: the columns of a two-dimensional one, else its whole text.
std::vector<std::string> Texts(const Parameter* p) {
  std::vector<std::string> out;
  if (!p || p->type != -1) return out;
  if (p->dims.size() < 2) return {Trimmed(p->data)};
  std::size_t width = p->dims[0];
  for (std::size_t i = 0; width && i + width <= p->data.size(); i += width) out.push_back(Trimmed(p->data.substr(i, width)));
  return out;
}

// NAME, NAME2, NAME3, ... of a group, one after the other, until `count` values are found or the
// next is missing.
template <class Value, class Read>
std::vector<Value> Series(const Parameters& ps, std::string_view group, std::string_view name, std::size_t count, Value missing,
                          Read read) {
  std::vector<Value> out;
  for (int part = 1; out.size() < count; ++part) {
    const Parameter* p = ps.Find(group, std::string(name) + (part > 1 ? std::to_string(part) : ""));
    if (!p) break;
    std::vector<Value> more = read(p);
    out.insert(out.end(), more.begin(), more.end());
    if (more.empty()) break;
  }
  out.resize(count, missing);
  return out;
}

std::vector<std::string> TextSeries(const Parameters& ps, std::string_view group, std::string_view name, std::size_t count) {
  return Series<std::string>(ps, group, name, count, {}, [](const Parameter* p) { return Texts(p); });
}

std::vector<double> NumberSeries(const Parameters& ps, std::string_view group, std::string_view name, std::size_t count,
                                 double missing, bool signedWords) {
  return Series<double>(ps, group, name, count, missing, [&](const Parameter* p) { return Numbers(p, signedWords); });
}

std::string Upper(std::string_view text) {
  std::string out;
  for (char c : text) out += static_cast<char>(c >= 'a' && c <= 'z' ? c - 'a' + 'A' : c);
  return out;
}

// ---- What the file holds -----------------------------------------------------------------------

// Where the frames are and how each is laid out.
struct Layout {
  Form form = Form::Intel;
  bool floats = false, unsignedAnalog = false;
  double scale = 1;  // of 16-bit coordinates
  std::size_t points = 0, channels = 0, samplesPerFrame = 0, start = 0, frameBytes = 0;
  std::size_t Word() const { return floats ? 4 : 2; }
};

// A parameter's value where it is usable (a finite number above 0), else the header's.
double Usable(std::optional<double> parameter, double header) { return parameter && *parameter > 0 ? *parameter : header; }

// The count a parameter gives (a whole number from 0 to 65535), or `header` where it gives none.
std::size_t CountOf(const Parameter* p, std::size_t header, const char* what) {
  std::optional<double> n = Number(p);
  if (!n) return header;
  if (!(*n >= 0 && *n <= 65535)) Damaged("its " + std::string(what) + " is not a number from 0 to 65535");
  return static_cast<std::size_t>(*n);
}

double UnitFactor(const Parameters& ps) {
  std::vector<std::string> units = Texts(ps.Find("POINT", "UNITS"));
  std::string unit = units.empty() ? std::string() : Upper(units[0]);
  if (unit.empty() || unit == "MM") return 1;
  if (unit == "CM") return 10;
  if (unit == "M") return 1000;
  Refuse("the C3D file's points are in '" + Shown(units[0]) + "', not in mm, cm or m");
}

// Notes where the header gives another `what` than the parameters, and which was taken.
void Compare(std::vector<std::string>& notes, const char* what, double header, double parameter, bool headerTaken) {
  if (header != parameter)
    notes.push_back("its header gives " + Shortest(header) + " as its " + what + " and its parameters " + Shortest(parameter) + ": " +
                    Shortest(headerTaken ? header : parameter) + " was taken");
}

Layout LayoutOf(const Header& h, const Parameters& ps, Form form, std::vector<std::string>& notes) {
  Layout l;
  l.form = form;
  std::optional<double> scale = Number(ps.Find("POINT", "SCALE"));
  l.scale = scale && *scale != 0 ? *scale : h.scale;
  if (!std::isfinite(l.scale) || l.scale == 0) Damaged("its scale factor is not a number other than 0");
  if (scale && *scale != 0) Compare(notes, "scale", h.scale, *scale, false);
  l.floats = l.scale < 0;
  l.points = CountOf(ps.Find("POINT", "USED"), h.points, "point count");
  Compare(notes, "point count", static_cast<double>(h.points), static_cast<double>(l.points), false);
  l.channels = CountOf(ps.Find("ANALOG", "USED"), h.analogWords / std::max<std::size_t>(1, h.samplesPerFrame), "analog channel count");
  std::vector<std::string> format = Texts(ps.Find("ANALOG", "FORMAT"));
  l.unsignedAnalog = !format.empty() && Upper(format[0]) == "UNSIGNED";
  std::size_t dataBlock = h.dataBlock, given = CountOf(ps.Find("POINT", "DATA_START"), 0, "data start");
  if (dataBlock <= h.parameterBlock) dataBlock = given;
  if (dataBlock <= h.parameterBlock) Damaged("its data do not start after its parameters");
  if (given > h.parameterBlock) Compare(notes, "data start", static_cast<double>(h.dataBlock), static_cast<double>(given), dataBlock == h.dataBlock);
  l.start = (dataBlock - 1) * kBlock;
  return l;
}

// Analog samples per frame: ANALOG:RATE over the frame rate, rounded; the header's where that rate
// is not given.
std::size_t SamplesPerFrame(const Header& h, const Parameters& ps, double rate, std::size_t channels) {
  if (channels == 0) return 0;
  std::optional<double> analogRate = Number(ps.Find("ANALOG", "RATE"));
  if (analogRate && *analogRate > 0) {
    double ratio = std::max(1.0, std::round(*analogRate / rate));
    if (!(ratio <= 65535)) Damaged("it gives more than 65535 analog samples a frame");
    return static_cast<std::size_t>(ratio);
  }
  if (h.samplesPerFrame) return h.samplesPerFrame;
  return std::max<std::size_t>(1, h.analogWords / channels);
}

// The frame count: the largest that the header (last - first + 1), TRIAL:ACTUAL_START_FIELD and
// ACTUAL_END_FIELD, POINT:LONG_FRAMES or POINT:FRAMES give. Where that is one frame more than the
// header gives and the data hold just the header's count, the header's holds (with a note); data
// that end before the last frame are damage.
std::size_t FrameCount(std::string_view file, const Header& h, const Parameters& ps, const Layout& l, std::vector<std::string>& notes) {
  std::vector<double> counts;
  double header = h.last >= h.first ? static_cast<double>(h.last - h.first + 1) : 0;
  if (header > 0) counts.push_back(header);
  std::vector<double> start = Numbers(ps.Find("TRIAL", "ACTUAL_START_FIELD")), end = Numbers(ps.Find("TRIAL", "ACTUAL_END_FIELD"));
  if (start.size() == 2 && end.size() == 2 && end[0] + 65536 * end[1] >= start[0] + 65536 * start[1])
    counts.push_back(end[0] + 65536 * end[1] - start[0] - 65536 * start[1] + 1);
  for (const char* name : {"LONG_FRAMES", "FRAMES"})
    if (std::optional<double> n = Number(ps.Find("POINT", name)); n && *n >= 1) counts.push_back(std::floor(*n));
  if (counts.empty()) Damaged("its last frame comes before its first");
  double wanted = *std::max_element(counts.begin(), counts.end());
  if (wanted > static_cast<double>(kMaxFrames)) Damaged("it has more than " + std::to_string(kMaxFrames) + " frames");
  auto count = static_cast<std::size_t>(wanted);
  std::size_t held = l.frameBytes == 0 ? count : l.start > file.size() ? 0 : (file.size() - l.start) / l.frameBytes;
  if (held >= count) return count;
  if (held > 0 && held + 1 == count && static_cast<double>(held) == header) {
    notes.push_back("it gives " + std::to_string(count) + " frames and its data hold " + std::to_string(held) + ": " +
                    std::to_string(held) + " frames were read");
    return held;
  }
  Damaged("it ends before its last frame");
}

// A coordinate in the file's unit: a float, or a 16-bit integer times the scale, rounded to a float
// (so that both forms of the same data give the same numbers); infinite where it is beyond a float.
template <Form F, bool Floats>
float Coordinate(const char* at, double scale) {
  if constexpr (Floats) return Real<F>(at);
  double value = static_cast<std::int16_t>(Load16(at, F == Form::Mips)) * scale;
  return std::fabs(value) <= std::numeric_limits<float>::max() ? static_cast<float>(value) : std::numeric_limits<float>::infinity();
}

// Coordinates turned to millimetres by `factor`, where the fourth word says the point was seen.
template <Form F, bool Floats>
void ReadPoints(std::string_view file, const Layout& l, double factor, Take& take) {
  for (std::size_t f = 0; f < take.frames; ++f) {
    const char* row = file.data() + l.start + f * l.frameBytes;
    for (std::size_t p = 0; p < l.points; ++p) {
      const char* at = row + p * 4 * l.Word();
      float xyz[3];
      for (int a = 0; a < 3; ++a) xyz[a] = Coordinate<F, Floats>(at + a * l.Word(), l.scale);
      bool seen = Floats ? Real<F>(at + 12) >= 0 : static_cast<std::int16_t>(Load16(at + 6, F == Form::Mips)) >= 0;
      if (!(seen && std::isfinite(xyz[0]) && std::isfinite(xyz[1]) && std::isfinite(xyz[2]))) continue;
      Point& point = take.points[p];
      for (int a = 0; a < 3; ++a) point.axis[a][f] = xyz[a] * factor;
      point.seen[f] = true;
    }
  }
}

template <Form F>
void ReadPoints(std::string_view file, const Layout& l, double factor, Take& take) {
  if (l.floats) ReadPoints<F, true>(file, l, factor, take);
  else ReadPoints<F, false>(file, l, factor, take);
}

// The analog channels' descriptions; their samples stay in the file's bytes.
void ReadAnalog(std::shared_ptr<const std::string> file, const Parameters& ps, const Layout& l, Take& take) {
  std::size_t n = l.channels;
  std::vector<std::string> labels = TextSeries(ps, "ANALOG", "LABELS", n), descriptions = TextSeries(ps, "ANALOG", "DESCRIPTIONS", n),
                           units = TextSeries(ps, "ANALOG", "UNITS", n);
  std::vector<double> scales = NumberSeries(ps, "ANALOG", "SCALE", n, 1, true);
  std::vector<double> offsets = NumberSeries(ps, "ANALOG", "OFFSET", n, 0, !l.unsignedAnalog);
  take.analog.resize(n);
  for (std::size_t c = 0; c < n; ++c) {
    Analog& a = take.analog[c];
    a.label = labels[c], a.description = descriptions[c], a.unit = units[c];
    a.scale = std::isfinite(scales[c]) ? scales[c] : 1, a.offset = std::isfinite(offsets[c]) ? offsets[c] : 0;
    a.column = c;
  }
  std::optional<double> general = Number(ps.Find("ANALOG", "GEN_SCALE"));
  take.generalScale = general ? *general : 1;
  using Kind = AnalogData::Kind;
  Kind kind = l.floats ? Kind::Float : l.unsignedAnalog ? Kind::Unsigned16 : Kind::Signed16;
  if (n > 0)
    take.samples = AnalogData(std::move(file), {l.start + l.points * 4 * l.Word(), l.frameBytes, n, l.samplesPerFrame, take.frames, l.form, kind});
}

}  // namespace

bool ValidName(std::string_view name) {
  return !name.empty() && name.size() <= 127 && std::all_of(name.begin(), name.end(), [](char c) { return c >= 0x20 && c <= 0x7e; });
}

bool OwnGroup(std::string_view name) {
  std::string upper = Upper(name);
  return upper == "POINT" || upper == "ANALOG" || upper == "TRIAL";
}

Take Read(std::string bytes) {
  auto owned = std::make_shared<const std::string>(std::move(bytes));
  std::string_view file = *owned;
  if (file.size() < kBlock || static_cast<std::uint8_t>(file[1]) != kKey) Damaged("it does not start with a C3D header");
  std::size_t block = static_cast<std::uint8_t>(file[0]);
  if (block < 2) Damaged("its parameters start in block " + std::to_string(block));
  std::size_t begin = (block - 1) * kBlock;
  if (begin + 4 > file.size()) Damaged("it ends before its parameters");
  auto form = static_cast<Form>(file[begin + 3]);
  if (form != Form::Intel && form != Form::Dec && form != Form::Mips)
    Damaged("its processor type " + std::to_string(static_cast<std::uint8_t>(form)) + " is none of 84 (Intel), 85 (DEC), 86 (MIPS)");
  Header h = ReadHeader(file, form);
  // The section runs for the blocks it declares, and on to the data where they start later.
  std::size_t declared = begin + kBlock * static_cast<std::uint8_t>(file[begin + 2]);
  std::size_t data = h.dataBlock > block ? (h.dataBlock - 1) * kBlock : 0;
  Parameters ps(file, begin + 4, std::min(file.size(), std::max(declared, data)), form);

  Take take;
  take.rate = Usable(Number(ps.Find("POINT", "RATE")), h.rate);
  if (!(take.rate > 0) || !std::isfinite(take.rate)) Damaged("its frame rate is not a positive number");
  Layout l = LayoutOf(h, ps, form, take.notes);
  if (std::optional<double> rate = Number(ps.Find("POINT", "RATE")); rate && *rate > 0) Compare(take.notes, "frame rate", h.rate, *rate, false);
  l.samplesPerFrame = SamplesPerFrame(h, ps, take.rate, l.channels);
  l.frameBytes = (l.points * 4 + l.channels * l.samplesPerFrame) * l.Word();
  take.frames = FrameCount(file, h, ps, l, take.notes);
  double factor = UnitFactor(ps);
  std::vector<std::string> labels = TextSeries(ps, "POINT", "LABELS", l.points);
  take.points.resize(l.points);
  for (std::size_t p = 0; p < l.points; ++p) {
    take.points[p].label = labels[p];
    for (auto& axis : take.points[p].axis) axis.assign(take.frames, 0.0);
    take.points[p].seen.assign(take.frames, false);
  }
  if (form == Form::Intel) ReadPoints<Form::Intel>(file, l, factor, take);
  else if (form == Form::Dec) ReadPoints<Form::Dec>(file, l, factor, take);
  else ReadPoints<Form::Mips>(file, l, factor, take);
  ReadAnalog(std::move(owned), ps, l, take);
  take.groups = ps.Others();
  return take;
}

// ---- Analog samples --------------------------------------------------------------------------------

namespace {

// One sample of form F and kind K.
template <Form F, AnalogData::Kind K>
struct Sample {
  float operator()(const char* at) const {
    if constexpr (K == AnalogData::Kind::Float) return Real<F>(at);
    else if constexpr (K == AnalogData::Kind::Unsigned16) return Load16(at, F == Form::Mips);
    else return static_cast<std::int16_t>(Load16(at, F == Form::Mips));
  }
};

// use(Sample<F, K>{}) for the layout's form and kind, so that each loop is made for its own.
template <Form F, class Use>
decltype(auto) ByKind(AnalogData::Kind kind, Use&& use) {
  using K = AnalogData::Kind;
  if (kind == K::Float) return use(Sample<F, K::Float>{});
  if (kind == K::Unsigned16) return use(Sample<F, K::Unsigned16>{});
  return use(Sample<F, K::Signed16>{});
}

template <class Use>
decltype(auto) BySample(const AnalogData::Layout& l, Use&& use) {
  if (l.form == Form::Dec) return ByKind<Form::Dec>(l.kind, use);
  if (l.form == Form::Mips) return ByKind<Form::Mips>(l.kind, use);
  return ByKind<Form::Intel>(l.kind, use);
}

std::size_t WordOf(const AnalogData::Layout& l) { return l.kind == AnalogData::Kind::Float ? 4 : 2; }

}  // namespace

AnalogData AnalogData::FromChannels(const std::vector<std::vector<float>>& channels, std::size_t samplesPerFrame, std::size_t frames) {
  std::size_t n = channels.size();
  std::string bytes(frames * samplesPerFrame * n * 4, '\0');
  for (std::size_t c = 0; c < n; ++c)
    for (std::size_t i = 0; i < frames * samplesPerFrame; ++i) Store32(&bytes[(i * n + c) * 4], std::bit_cast<std::uint32_t>(channels[c][i]));
  Layout layout{0, samplesPerFrame * n * 4, n, samplesPerFrame, frames, Form::Intel, Kind::Float};
  return AnalogData(std::make_shared<const std::string>(std::move(bytes)), layout);
}

std::vector<float> AnalogData::Channel(std::size_t column) const {
  std::vector<float> out;
  out.reserve(layout_.frames * layout_.samplesPerFrame);
  std::size_t step = layout_.channels * WordOf(layout_);
  BySample(layout_, [&](auto sample) {
    for (std::size_t f = 0; f < layout_.frames; ++f) {
      const char* at = bytes_->data() + layout_.start + f * layout_.stride + column * WordOf(layout_);
      for (std::size_t s = 0; s < layout_.samplesPerFrame; ++s, at += step) out.push_back(sample(at));
    }
  });
  return out;
}

char* AnalogData::WriteFrame(std::size_t frame, const std::vector<std::size_t>& columns, char* out) const {
  const char* row = bytes_->data() + layout_.start + frame * layout_.stride;
  bool all = columns.size() == layout_.channels;
  for (std::size_t c = 0; all && c < columns.size(); ++c) all = columns[c] == c;
  if (all && layout_.form == Form::Intel && layout_.kind == Kind::Float) {  // already what is written
    std::memcpy(out, row, layout_.channels * layout_.samplesPerFrame * 4);
    return out + layout_.channels * layout_.samplesPerFrame * 4;
  }
  std::size_t word = WordOf(layout_);
  return BySample(layout_, [&](auto sample) {
    for (std::size_t s = 0; s < layout_.samplesPerFrame; ++s, row += layout_.channels * word)
      for (std::size_t c : columns) Store32(out, std::bit_cast<std::uint32_t>(sample(row + c * word))), out += 4;
    return out;
  });
}

// ---- Writing -------------------------------------------------------------------------------------

namespace {

// The parameter section: groups, each followed by its parameters.
class ParameterWriter {
 public:
  void Group(std::int8_t id, std::string_view name, std::string_view description = {}) {
    Item(static_cast<std::int8_t>(-id), name, static_cast<char>(description.size()) + std::string(description));
  }
  void Add(std::int8_t group, const Parameter& p) {
    std::string body{static_cast<char>(p.type), static_cast<char>(p.dims.size())};
    for (std::uint8_t d : p.dims) body += static_cast<char>(d);
    body += p.data;
    body += static_cast<char>(p.description.size());
    Item(group, p.name, body + p.description);
  }
  void Word(std::int8_t group, std::string_view name, std::uint16_t value) { Words(group, name, {value}, true); }
  void Float(std::int8_t group, std::string_view name, float value) { Floats(group, name, {value}, true); }
  // Arrays of more than 255 values are split as texts are: NAME, NAME2, ...
  void Words(std::int8_t group, std::string_view name, const std::vector<std::uint16_t>& values, bool single = false) {
    Array(group, name, values.size(), single, 2, [&](std::string& data, std::size_t i) { Store16(data, values[i]); });
  }
  void Floats(std::int8_t group, std::string_view name, const std::vector<float>& values, bool single = false) {
    Array(group, name, values.size(), single, 4, [&](std::string& data, std::size_t i) { StoreFloat(data, values[i]); });
  }
  // Texts padded with blanks to the longest, split into NAME, NAME2, NAME3... so that no dimension
  // exceeds a byte and no parameter exceeds what its offset word can skip.
  void Texts(std::int8_t group, std::string_view name, const std::vector<std::string>& texts) {
    std::size_t width = 1;
    for (const std::string& t : texts) width = std::max(width, t.size());
    std::size_t per = std::min<std::size_t>(255, 30000 / width);
    for (std::size_t from = 0, part = 1; from < texts.size() || part == 1; from += per, ++part) {
      std::size_t count = std::min(per, texts.size() - std::min(from, texts.size()));
      std::string data;
      for (std::size_t i = from; i < from + count; ++i) data += texts[i] + std::string(width - texts[i].size(), ' ');
      Add(group, {std::string(name) + (part > 1 ? std::to_string(part) : ""), {}, -1, {static_cast<std::uint8_t>(width), static_cast<std::uint8_t>(count)}, data});
    }
  }
  void Text(std::int8_t group, std::string_view name, std::string_view text) {
    Add(group, {std::string(name), {}, -1, {static_cast<std::uint8_t>(text.size())}, std::string(text)});
  }
  // The section with its four-byte heading, padded to whole blocks; the last item's offset is 0.
  std::string Finish() {
    std::size_t blocks = (4 + items_.size() + kBlock - 1) / kBlock;
    if (blocks > 255) Refuse("the take's parameters do not fit a C3D file's parameter section");
    if (last_ != std::string::npos) items_[last_] = items_[last_ + 1] = '\0';
    std::string out{'\x01', static_cast<char>(kKey), static_cast<char>(blocks), static_cast<char>(Form::Intel)};
    out += items_;
    out.resize(blocks * kBlock, '\0');
    return out;
  }

 private:
  template <class Put>
  void Array(std::int8_t group, std::string_view name, std::size_t count, bool single, std::int8_t type, Put put) {
    for (std::size_t from = 0, part = 1; from < count || part == 1; from += 255, ++part) {
      std::size_t to = std::min(from + 255, count);
      std::string data;
      for (std::size_t i = from; i < to; ++i) put(data, i);
      std::vector<std::uint8_t> dims;
      if (!single) dims.push_back(static_cast<std::uint8_t>(to - std::min(from, to)));
      Add(group, {std::string(name) + (part > 1 ? std::to_string(part) : ""), {}, type, dims, data});
    }
  }
  void Item(std::int8_t id, std::string_view name, const std::string& body) {
    items_ += static_cast<char>(name.size());
    items_ += static_cast<char>(id);
    items_ += name;
    last_ = items_.size();
    Store16(items_, static_cast<std::uint16_t>(body.size() + 2));
    items_ += body;
  }
  std::string items_;
  std::size_t last_ = std::string::npos;
};

enum : std::int8_t { kPoint = 1, kAnalog = 2, kTrial = 3 };

// ANALOG:OFFSET as 16-bit integers, signed, or unsigned with ANALOG:FORMAT "UNSIGNED" where an offset
// needs it; as floats where an offset is no 16-bit integer at all.
void Offsets(ParameterWriter& p, const Take& take) {
  bool whole = true, negative = false, large = false;
  for (const Analog& a : take.analog) {
    whole = whole && a.offset == std::floor(a.offset) && a.offset >= -32768 && a.offset <= 65535;
    negative = negative || a.offset < 0, large = large || a.offset > 32767;
  }
  std::vector<float> floats;
  for (const Analog& a : take.analog) floats.push_back(static_cast<float>(a.offset));
  if (!whole || (negative && large)) return p.Floats(kAnalog, "OFFSET", floats);
  std::vector<std::uint16_t> words;
  for (const Analog& a : take.analog) words.push_back(static_cast<std::uint16_t>(static_cast<std::int32_t>(a.offset)));
  p.Words(kAnalog, "OFFSET", words);
  if (large) p.Text(kAnalog, "FORMAT", "UNSIGNED");
}

void AnalogGroup(ParameterWriter& p, const Take& take) {
  std::vector<std::string> labels, descriptions, units;
  std::vector<float> scales;
  for (const Analog& a : take.analog) {
    labels.push_back(a.label), descriptions.push_back(a.description), units.push_back(a.unit);
    scales.push_back(static_cast<float>(a.scale));
  }
  p.Group(kAnalog, "ANALOG");
  p.Word(kAnalog, "USED", static_cast<std::uint16_t>(take.analog.size()));
  p.Float(kAnalog, "RATE", static_cast<float>(take.rate * static_cast<double>(take.samples.samplesPerFrame())));
  p.Float(kAnalog, "GEN_SCALE", static_cast<float>(take.generalScale));
  if (take.analog.empty()) return;
  p.Floats(kAnalog, "SCALE", scales);
  Offsets(p, take);
  p.Texts(kAnalog, "LABELS", labels);
  p.Texts(kAnalog, "DESCRIPTIONS", descriptions);
  p.Texts(kAnalog, "UNITS", units);
}

// A parameter that a kept group can write back: its offset word must be able to skip it.
bool Fits(const Parameter& p) { return 4 + p.dims.size() + p.data.size() + 1 + p.description.size() <= 65535; }

std::string ParameterSection(const Take& take, std::uint16_t dataBlock) {
  std::vector<std::string> labels;
  for (const Point& point : take.points) labels.push_back(point.label);
  auto frames = static_cast<std::uint32_t>(take.frames);
  ParameterWriter p;
  p.Group(kPoint, "POINT");
  p.Word(kPoint, "USED", static_cast<std::uint16_t>(labels.size()));
  p.Word(kPoint, "FRAMES", static_cast<std::uint16_t>(std::min<std::uint32_t>(frames, 65535)));
  p.Word(kPoint, "DATA_START", dataBlock);
  p.Float(kPoint, "SCALE", -1.0f);
  p.Float(kPoint, "RATE", static_cast<float>(take.rate));
  p.Text(kPoint, "UNITS", "mm");
  p.Texts(kPoint, "LABELS", labels);
  p.Texts(kPoint, "DESCRIPTIONS", std::vector<std::string>(labels.size(), ""));
  if (frames >= 65535) p.Float(kPoint, "LONG_FRAMES", static_cast<float>(frames));
  AnalogGroup(p, take);
  p.Group(kTrial, "TRIAL");
  p.Words(kTrial, "ACTUAL_START_FIELD", {1, 0});
  p.Words(kTrial, "ACTUAL_END_FIELD", {static_cast<std::uint16_t>(frames & 0xffff), static_cast<std::uint16_t>(frames >> 16)});
  std::int8_t id = kTrial;
  for (const Group& g : take.groups) {
    if (id == 127) break;
    p.Group(++id, g.name, g.description);
    for (const Parameter& parameter : g.parameters)
      if (Fits(parameter)) p.Add(id, parameter);
  }
  return p.Finish();
}

void CheckWritable(const Take& take) {
  if (take.points.size() > 65535) Refuse("too many markers for a C3D file");
  std::size_t perFrame = take.samples.samplesPerFrame();
  if (take.analog.size() > 32767 || take.analog.size() * perFrame > 65535 || perFrame > 65535)
    Refuse("too many analog samples per frame for a C3D file");
  for (const Point& point : take.points)
    if (point.label.size() > 255) Refuse("the label '" + point.label + "' is longer than a C3D file allows");
  for (const Analog& a : take.analog) {
    if (a.label.size() > 255 || a.description.size() > 255 || a.unit.size() > 255)
      Refuse("the analog channel '" + a.label + "' has a text longer than a C3D file allows");
    if (a.column >= take.samples.channels() || take.samples.frames() != take.frames)
      Refuse("the analog channel '" + a.label + "' does not have its samples for every frame");
  }
}

// Frame by frame: x, y, z and 0 (seen) or 0, 0, 0 and -1 (not seen) per point, then the analog samples.
void WriteFrames(const Take& take, char* out) {
  std::vector<std::size_t> columns;
  for (const Analog& a : take.analog) columns.push_back(a.column);
  for (std::size_t f = 0; f < take.frames; ++f) {
    for (const Point& point : take.points) {
      bool seen = point.seen[f];
      for (const auto& axis : point.axis) {
        double value = seen ? axis[f] : 0.0;
        if (!(std::fabs(value) <= std::numeric_limits<float>::max()))
          Refuse("the marker '" + point.label + "' holds " + Shortest(value) + ", too large for a C3D file");
        Store32(out, std::bit_cast<std::uint32_t>(static_cast<float>(value))), out += 4;
      }
      Store32(out, std::bit_cast<std::uint32_t>(seen ? 0.0f : -1.0f)), out += 4;
    }
    if (!columns.empty()) out = take.samples.WriteFrame(f, columns, out);
  }
}

}  // namespace

std::string Write(const Take& take) {
  CheckWritable(take);
  auto frames = static_cast<std::uint32_t>(take.frames);
  std::string section = ParameterSection(take, 0);
  auto dataBlock = static_cast<std::uint16_t>(2 + section.size() / kBlock);
  section = ParameterSection(take, dataBlock);  // the same size: only a number changed
  std::size_t analogWords = take.analog.size() * take.samples.samplesPerFrame();

  std::string out{'\x02', static_cast<char>(kKey)};
  Store16(out, static_cast<std::uint16_t>(take.points.size()));
  Store16(out, static_cast<std::uint16_t>(analogWords));
  Store16(out, 1);  // first frame
  Store16(out, static_cast<std::uint16_t>(std::min<std::uint32_t>(frames, 65535)));  // last (TRIAL beyond)
  Store16(out, 0);  // largest gap filled
  StoreFloat(out, -1.0f);  // scale: negative for float data
  Store16(out, dataBlock);
  Store16(out, static_cast<std::uint16_t>(take.samples.samplesPerFrame()));
  StoreFloat(out, static_cast<float>(take.rate));
  out.resize(kBlock, '\0');
  out += section;
  std::size_t start = out.size(), bytes = take.frames * (take.points.size() * 4 + analogWords) * 4;
  out.resize((start + bytes + kBlock - 1) / kBlock * kBlock, '\0');
  WriteFrames(take, out.data() + start);
  return out;
}

}  // namespace client3::host::c3d
