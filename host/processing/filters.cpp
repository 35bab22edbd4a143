// The channel filters: a windowed-sinc low-pass filter and a weighted moving average.
#include "host/processing/filters.h"

#include <algorithm>
#include <cmath>

#include "host/commands/lookups.h"

namespace client3::host {

namespace {

constexpr double kPi = 3.14159265358979323846;

// The kernel's length must be odd (so that it is centred on the frame it replaces) and no longer
// than the take.
void CheckLength(int frames, std::string_view what, std::int32_t length) {
  if (length < 1 || length % 2 == 0 || length > frames)
    Refuse(std::string(what) + " must be an odd number from 1 to the take's " + std::to_string(frames) + " frames, not " +
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
  std::size_t half = kernel.size() / 2;
  std::vector<double> extended, result;
  for (auto [a, b] : Runs(c.values.size(), [&](std::size_t f) { return c.keys[f] && usable[f]; })) {
    std::size_t length = b - a;
    if (length <= half) {
      tally.tooShort += length;
      continue;
    }
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
}

void Normalise(std::vector<double>& kernel) {
  double sum = 0;
  for (double k : kernel) sum += k;
  for (double& k : kernel) k /= sum;
}

}  // namespace

Kernel LowPass(const Scene& scene, std::int32_t taps, double cutoff, double rate, double transition) {
  CheckLength(scene.frames, "the number of taps", taps);
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
  return {kernel, "low-pass of " + Count(n, "tap") + ", cut-off " + FloatText(cutoff) + " Hz, transition " + FloatText(transition) +
                      " Hz, sample rate " + FloatText(rate) + " Hz"};
}

Kernel WeightedAverage(const Scene& scene, std::int32_t window, std::int32_t weighting) {
  CheckLength(scene.frames, "the window", window);
  if (weighting != 0 && weighting != 1) Refuse("weighting " + std::to_string(weighting) + " is not 0 (uniform) or 1 (triangular)");
  auto n = static_cast<std::size_t>(window);
  std::vector<double> kernel(n, 1);
  if (weighting == 1)
    for (std::size_t i = 0; i < n; ++i) kernel[i] = static_cast<double>(std::min(i, n - 1 - i) + 1);
  Normalise(kernel);
  return {kernel, std::string(weighting ? "triangular" : "uniform") + " average over " + Count(n, "frame")};
}

std::string Filter(const FilterTarget& target, const Kernel& kernel) {
  Tally tally;
  for (Channel* c : target.channels) Apply(*c, target.usable, kernel.weights, tally);
  std::string summary = std::to_string(tally.changed) + " of " + Count(tally.filtered, "sample") + " changed in " +
                        Count(target.channels.size(), "channel") + " (" + kernel.how + ")";
  if (tally.tooShort)
    summary += "; " + Count(tally.tooShort, "sample") + " in stretches of " + Count(kernel.weights.size() / 2, "keyed frame") +
               " or fewer left as they were";
  return summary;
}

}  // namespace client3::host
