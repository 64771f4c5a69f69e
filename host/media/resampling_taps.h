#pragma once

#include <cstddef>
#include <vector>

namespace calmframe::media {

// One axis of a resampling by the bicubic of Keys (1981) with a = -0.6, stretched over as many
// samples as there are for one where they get fewer. Where it reaches past an end the samples are
// mirrored at it.
struct ResamplingTaps {
  // Sample i of `to` lies at (i + 1/2) from / to - 1/2 + shift, counted in samples of `from`.
  ResamplingTaps(int from, int to, double shift);

  const float* of(int i) const { return weights.data() + static_cast<std::size_t>(i) * width; }

  std::size_t width = 0;       // taps of a sample
  std::vector<int> left;       // of each sample, the first one that it is made of
  std::vector<float> weights;  // of each sample in turn
};

}  // namespace calmframe::media
