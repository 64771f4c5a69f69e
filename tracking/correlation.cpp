#include "tracking/correlation.h"

#include <algorithm>
#include <cmath>

#include "tracking/window_moments.h"

namespace marrow::tracking {

channel_moments ChannelMoments(const float* window, const window_shape& shape) {
  channel_moments moments;
  kernels::ChannelMeans(window, shape, moments.mean);
  kernels::CentredSquares(window, moments.mean, shape, moments.square);
  return moments;
}

float NormalisedCorrelation(const window_shape& shape, const float* first, const float* second) {
  return NormalisedCorrelation(shape, first, ChannelMoments(first, shape), second);
}

// Centred sums: the difference of n S(xx) and S(x)^2 would lose what a low contrast has to say.
float NormalisedCorrelation(const window_shape& shape, const float* first,
                            const channel_moments& first_moments, const float* second) {
  float second_mean[kMaxChannels];
  double xy[kMaxChannels];
  double yy[kMaxChannels];
  kernels::ChannelMeans(second, shape, second_mean);
  kernels::CentredProducts(first, first_moments.mean, second, second_mean, shape, xy, yy);
  double total = 0.0;
  for (std::size_t c = 0; c < shape.channels; ++c) {
    const double xx = first_moments.square[c];
    if (xx > 0.0 && yy[c] > 0.0) total += xy[c] / std::sqrt(xx * yy[c]);
  }
  return static_cast<float>(total / static_cast<double>(shape.channels));
}

std::size_t FindPrimaryChannel(const float* template_plane, const window_shape& shape,
                               float threshold) {
  double energy[kMaxChannels];
  kernels::ChannelEnergies(template_plane, shape, energy);
  const double limit = static_cast<double>(threshold) * static_cast<double>(threshold) *
                       static_cast<double>(shape.pixels());
  const std::size_t channels = shape.channels;
  const double* dark =
      std::find_if_not(energy, energy + channels, [limit](double e) { return e >= limit; });
  if (dark == energy + channels) return 0;
  if (channels != 3) {
    return static_cast<std::size_t>(std::max_element(energy, energy + channels) - energy) + 1;
  }
  const std::size_t next = static_cast<std::size_t>(dark - energy + 1) % 3;
  const std::size_t after = (next + 1) % 3;
  return (energy[next] >= energy[after] ? next : after) + 1;
}

}  // namespace marrow::tracking
