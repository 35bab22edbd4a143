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

// One analog channel. Its physical values are (sample - offset) x scale x the take's general scale;
// samples are kept as the file's numbers (16-bit integers and floats are exact in a float).
struct Analog {
  std::string label, description, unit;  // label empty where the file gives none
  double scale = 1, offset = 0;
  std::vector<float> samples;  // samplesPerFrame for each frame, frame by frame
};

struct Take {
  double rate = 0;  // frames per second
  std::size_t frames = 0;
  std::vector<Point> points;
  std::size_t samplesPerFrame = 0;  // analog samples of each channel per frame
  double generalScale = 1;
  std::vector<Analog> analog;
  std::vector<Group> groups;  // the file's groups other than POINT, ANALOG and TRIAL
  std::vector<std::string> notes;  // how disagreements between header and parameters were settled
};

// The groups that the application writes itself; every other group is kept as it was read.
inline constexpr std::string_view kOwnGroups[] = {"POINT", "ANALOG", "TRIAL"};

// The take a C3D file holds; throws Failure when the file is damaged or holds what the application
// cannot take (coordinates in units other than mm, cm or m).
Take Read(std::string_view file);

// The file of `take` in the Intel form with float data; throws Failure when the take does not fit
// a C3D file (a value beyond the float range, a label of more than 255 bytes, too many points).
std::string Write(const Take& take);

}  // namespace client3::host::c3d
