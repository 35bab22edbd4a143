// The channel filters: a windowed-sinc low-pass filter and a weighted moving average. Both run over
// each stretch of consecutive keyed frames on its own, so that values never cross a gap, and both
// check every constant before they change anything.
#include <algorithm>
#include <charconv>
#include <cmath>

#include "host/handlers.h"

namespace client3::host {

using protocol::Reader;
using protocol::Writer;

namespace {

constexpr double kPi = 3.14159265358979323846;

// What a filter command names: the channels to filter and the frames it may use.
struct Target {
  std::vector<Channel*> channels;
  std::vector<bool> usable;  // frames the filter may read and write (the selected ones, or all)
};

Target TargetOf(Scene& scene, Reader& in) {
  Object& o = ObjectOf(scene, in.Get<std::uint64_t>());
  ObjectId channelId = in.Get<std::uint64_t>();
  std::string_view component = in.Text();
  bool selectedOnly = in.Get<bool>();
  Channel* named = o.FindChannel(channelId);
  if (!named) Refuse("object '" + o.name + "' has no channel with id " + std::to_string(channelId));
  Target target;
  if (component.empty()) {
    target.channels = {named};
  } else if (component == "XYZ") {
    for (std::string_view axis : {"X", "Y", "Z"}) {
      Channel* c = o.FindChannel(axis);
      if (!c) Refuse("object '" + o.name + "' has no channel '" + std::string(axis) + "' for component 'XYZ'");
      target.channels.push_back(c);
    }
    if (named != target.channels[0] && named != target.channels[1] && named != target.channels[2])
      Refuse("component 'XYZ' needs one of the channels X, Y or Z, not '" + named->name + "'");
  } else {
    Refuse("component '" + std::string(component) + "' is not '' (the channel) or 'XYZ' (the channels X, Y and Z)");
  }
  target.usable.assign(static_cast<std::size_t>(scene.frames), true);
  if (selectedOnly) {
    target.usable = scene.timeline.selected;
    if (std::find(target.usable.begin(), target.usable.end(), true) == target.usable.end())
      Refuse("only the selected frames were to be filtered, and no frame is selected");
  }
  return target;
}

// A value given as a float, in the shortest form that reads back as that float ("0.1", not
// "0.10000000149011612").
std::string FloatText(double value) {
  char text[32];
  auto [end, error] = std::to_chars(text, text + sizeof text, static_cast<float>(value));
  return std::string(text, error == std::errc() ? end : text);
}

// The kernel's length must be odd (so that it is centred on the frame it replaces) and no longer
// than the take.
void CheckLength(const Scene& scene, std::string_view what, std::int32_t length) {
  if (length < 1 || length % 2 == 0 || length > scene.frames)
    Refuse(std::string(what) + " must be an odd number from 1 to the take's " + std::to_string(scene.frames) + " frames, not " +
           std::to_string(length));
}

// How many samples (values of a channel at a frame) a filter replaced, how many of those took another
// value, and how many it left as they were in stretches too short for its kernel.
struct Tally {
  std::size_t filtered = 0, changed = 0, tooShort = 0;
};

// Replaces each usable keyed frame by the kernel's weighted sum of its neighbours. A stretch of
// keyed frames is extended at both ends by its reflection through its end value; a stretch no
// longer than half the kernel is left as it is.
void Apply(Channel& c, const std::vector<bool>& usable, const std::vector<double>& kernel, Tally& tally) {
  std::size_t half = kernel.size() / 2, frames = c.values.size();
  std::vector<double> extended, result;
  for (std::size_t a = 0; a < frames;) {
    if (!c.keys[a] || !usable[a]) {
      ++a;
      continue;
    }
    std::size_t b = a;
    while (b < frames && c.keys[b] && usable[b]) ++b;
    std::size_t length = b - a;
    if (length <= half) tally.tooShort += length;
    if (length > half) {
      extended.clear();
      for (std::size_t j = half; j >= 1; --j) extended.push_back(2 * c.values[a] - c.values[a + j]);
      extended.insert(extended.end(), c.values.begin() + static_cast<std::ptrdiff_t>(a), c.values.begin() + static_cast<std::ptrdiff_t>(b));
      for (std::size_t j = 1; j <= half; ++j) extended.push_back(2 * c.values[b - 1] - c.values[b - 1 - j]);
      result.assign(length, 0);
      for (std::size_t i = 0; i < length; ++i) {
        double sum = 0;
        for (std::size_t k = 0; k < kernel.size(); ++k) sum += kernel[k] * extended[i + k];
        result[i] = sum;
        tally.changed += sum != c.values[a + i];
      }
      tally.filtered += length;
      std::copy(result.begin(), result.end(), c.values.begin() + static_cast<std::ptrdiff_t>(a));
    }
    a = b;
  }
}

// Filters every channel of the target; what it did, in one line, with `how` the filter in words.
std::string ApplyAll(const Target& target, const std::vector<double>& kernel, const std::string& how) {
  Tally tally;
  for (Channel* c : target.channels) Apply(*c, target.usable, kernel, tally);
  std::string summary = std::to_string(tally.changed) + " of " + Count(tally.filtered, "sample") + " changed in " +
                        Count(target.channels.size(), "channel") + " (" + how + ")";
  if (tally.tooShort)
    summary += "; " + Count(tally.tooShort, "sample") + " in stretches of " + Count(kernel.size() / 2, "keyed frame") +
               " or fewer left as they were";
  return summary;
}

void Normalise(std::vector<double>& kernel) {
  double sum = 0;
  for (double k : kernel) sum += k;
  for (double& k : kernel) k /= sum;
}

// Low-pass by a windowed sinc: Taps coefficients of sinc(2 fc (n - M/2)) times a Hamming window,
// scaled to a gain of 1 at 0 Hz, where fc = Cutoff + Transition / 2 is the middle of the transition
// band. A SampleRate of 0 means the take's frame rate.
void FilterApplyFIR(Context& context, Reader& in, Writer&) {
  Scene& scene = context.scene;
  Target target = TargetOf(scene, in);
  std::int32_t taps = in.Get<std::int32_t>();
  double cutoff = in.Get<float>(), rate = in.Get<float>(), transition = in.Get<float>();
  CheckLength(scene, "the number of taps", taps);
  if (rate == 0) rate = scene.timeline.rate;
  if (!(rate > 0) || !std::isfinite(rate)) Refuse("the sample rate must be above 0 Hz (0 for the take's frame rate), not " + NumberText(rate));
  if (!(transition >= 0) || !std::isfinite(transition)) Refuse("the transition band must be 0 Hz or wider, not " + NumberText(transition));
  double edge = cutoff + transition / 2;
  if (!(cutoff > 0) || !(edge < rate / 2))
    Refuse("the cut-off (" + NumberText(cutoff) + " Hz) plus half the transition band (" + NumberText(transition / 2) +
           " Hz) must be above 0 and below the Nyquist frequency, " + NumberText(rate / 2) + " Hz");
  double fc = edge / rate;  // cycles per frame
  auto n = static_cast<std::size_t>(taps);
  std::vector<double> kernel(n);
  for (std::size_t i = 0; i < n; ++i) {
    double m = static_cast<double>(i) - static_cast<double>(n - 1) / 2;
    double x = 2 * fc * m;
    double sinc = m == 0 ? 1 : std::sin(kPi * x) / (kPi * x);
    double window = n == 1 ? 1 : 0.54 - 0.46 * std::cos(2 * kPi * static_cast<double>(i) / static_cast<double>(n - 1));
    kernel[i] = 2 * fc * sinc * window;
  }
  Normalise(kernel);
  context.summary = ApplyAll(target, kernel, "low-pass of " + Count(n, "tap") + ", cut-off " + FloatText(cutoff) + " Hz, transition " +
                                                 FloatText(transition) + " Hz, sample rate " + FloatText(rate) + " Hz");
}

// Weighted moving average over Window frames: Weighting 0 gives every frame the same weight,
// 1 weights them by a triangle (1, 2, ..., middle, ..., 2, 1); the weights are scaled to sum to 1.
void FilterApplyWeightedAverage(Context& context, Reader& in, Writer&) {
  Scene& scene = context.scene;
  Target target = TargetOf(scene, in);
  std::int32_t window = in.Get<std::int32_t>(), weighting = in.Get<std::int32_t>();
  CheckLength(scene, "the window", window);
  if (weighting != 0 && weighting != 1) Refuse("weighting " + std::to_string(weighting) + " is not 0 (uniform) or 1 (triangular)");
  auto n = static_cast<std::size_t>(window);
  std::vector<double> kernel(n, 1);
  if (weighting == 1)
    for (std::size_t i = 0; i < n; ++i) kernel[i] = static_cast<double>(std::min(i, n - 1 - i) + 1);
  Normalise(kernel);
  context.summary = ApplyAll(target, kernel, std::string(weighting ? "triangular" : "uniform") + " average over " + Count(n, "frame"));
}

constexpr HandlerEntry kHandlers[] = {
    {protocol::Id::FilterApplyFIR, &FilterApplyFIR},
    {protocol::Id::FilterApplyWeightedAverage, &FilterApplyWeightedAverage},
};

}  // namespace

std::span<const HandlerEntry> FilterHandlers() { return kHandlers; }

}  // namespace client3::host
