// The C3D motion-capture file: reading every form that capture systems write, and writing the Intel
// form with float data. Plain data in, plain data out: nothing here knows the scene or the socket.
//
// Reading takes the three processor forms (Intel, DEC and MIPS, the last big-endian), 16-bit integer
// or floating data (DEC floats included), parameter sections of any number of blocks, labels over
// several parameters (LABELS, LABELS2, ...) and frame counts beyond 65,535. Coordinates come back in
// millimetres whatever POINT:UNITS says. A damaged file is refused with a Failure whose message is
// "the C3D file is damaged: WHY", WHY in printable words. The rules that reconcile the header with the
// parameters are on the application's reference page; each is stated where it is applied.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace client3::host::c3d {

// A parameter as the Intel form holds it (16-bit integers little-endian, IEEE floats), whatever the
// form of the file it came from.
struct Parameter {
  std::string name, description;
  std::int8_t type = -1;            // -1 text, 1 byte, 2 16-bit integer, 4 float
  std::vector<std::uint8_t> dims;   // none for a single value
  std::string data;
};

struct Group {
  std::string name, description;
  std::vector<Parameter> parameters;
};

// One point's trajectory: millimetres, and whether it was seen at each frame (where it was not, its
// coordinates are 0).
struct Point {
  std::string label;  // as the file gives it, blanks taken off; empty where it gives none
  std::vector<double> axis[3];
  std::vector<bool> seen;
};

// The processor forms, as a parameter section's fourth byte names them.
enum class Form : std::uint8_t { Intel = 84, Dec = 85, Mips = 86 };

// The analog samples of a take as the file holds them, kept in its bytes and read when they are
// written out: frame after frame, `stride` bytes apart from `start`, each frame holding
// samplesPerFrame rounds of one sample of every channel in turn. A sample is a 16-bit integer (signed
// or not) or a float of the file's form, each exact in a float. Nothing changes them once read, so
// a take and its copies share them.
class AnalogData {
 public:
  enum class Kind : std::uint8_t { Signed16, Unsigned16, Float };
  struct Layout {
    std::size_t start = 0, stride = 0, channels = 0, samplesPerFrame = 0, frames = 0;
    Form form = Form::Intel;
    Kind kind = Kind::Float;
  };
  AnalogData() = default;
  AnalogData(std::shared_ptr<const std::string> bytes, Layout layout) : bytes_(std::move(bytes)), layout_(layout) {}
  // Float samples in the Intel form, from each channel's samples (samplesPerFrame x frames each).
  static AnalogData FromChannels(const std::vector<std::vector<float>>& channels, std::size_t samplesPerFrame, std::size_t frames);

  std::size_t channels() const { return layout_.channels; }
  std::size_t samplesPerFrame() const { return layout_.samplesPerFrame; }
  std::size_t frames() const { return layout_.frames; }
  // The samples of channel `column`, frame by frame.
  std::vector<float> Channel(std::size_t column) const;
  // Writes frame `frame`'s samples of the channels `columns`, in that order, as Intel floats at
  // `out`; returns the end of what it wrote.
  char* WriteFrame(std::size_t frame, const std::vector<std::size_t>& columns, char* out) const;

 private:
  std::shared_ptr<const std::string> bytes_;
  Layout layout_;
};

// One analog channel: its samples are column `column` of the take's AnalogData, and their physical
// values (sample - offset) x scale x the take's general scale.
struct Analog {
  std::string label, description, unit;  // label empty where the file gives none
  double scale = 1, offset = 0;
  std::size_t column = 0;
};

struct Take {
  double rate = 0;  // frames per second
  std::size_t frames = 0;
  std::vector<Point> points;
  AnalogData samples;
  double generalScale = 1;
  std::vector<Analog> analog;
  std::vector<Group> groups;  // the file's groups other than POINT, ANALOG and TRIAL
  std::vector<std::string> notes;  // how disagreements between header and parameters were settled
};

// Whether `name` can name a group or parameter: 1 to 127 printable ASCII characters.
bool ValidName(std::string_view name);
// Whether `name` names, in any case, one of the groups that the application writes itself (POINT,
// ANALOG, TRIAL); every other group is kept as it was read.
bool OwnGroup(std::string_view name);

// The take a C3D file holds (which keeps the file's bytes for its analog samples); throws Failure
// when the file is damaged or holds what the application cannot take (coordinates in units other
// than mm, cm or m).
Take Read(std::string file);

// The file of `take` in the Intel form with float data; throws Failure when the take does not fit
// a C3D file (a value beyond the float range, a label of more than 255 bytes, too many points).
std::string Write(const Take& take);

}  // namespace client3::host::c3d
