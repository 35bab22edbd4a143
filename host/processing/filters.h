// The channel filters: a windowed-sinc low-pass filter and a weighted moving average. Both run over
// each stretch of consecutive keyed frames on its own, so that values never cross a gap, and both
// check every constant before they change anything.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "host/scene/scene.h"

namespace client3::host {

// What a filter works on: the channels, and the frames it may read and write.
struct FilterTarget {
  std::vector<Channel*> channels;
  std::vector<bool> usable;
};

// A filter's weights, which sum to 1, and the filter in words for its summary.
struct Kernel {
  std::vector<double> weights;
  std::string how;
};

// Low-pass by a windowed sinc: Taps coefficients of sinc(2 fc (n - M/2)) times a Hamming window,
// scaled to a gain of 1 at 0 Hz, where fc = Cutoff + Transition / 2 is the middle of the transition
// band. A SampleRate of 0 means the take's frame rate.
Kernel LowPass(const Scene& scene, std::int32_t taps, double cutoff, double rate, double transition);
// Weighted moving average over Window frames: Weighting 0 gives every frame the same weight,
// 1 weights them by a triangle (1, 2, ..., middle, ..., 2, 1); the weights are scaled to sum to 1.
Kernel WeightedAverage(const Scene& scene, std::int32_t window, std::int32_t weighting);

// Filters every channel of the target; returns what it did, in one line.
std::string Filter(const FilterTarget& target, const Kernel& kernel);

}  // namespace client3::host
