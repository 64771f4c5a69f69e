#pragma once

#include <cstddef>

#include "tracking/window_shape.h"

namespace marrow::tracking {

// Mean and sum of squared differences from it, for each channel of a window.
struct channel_moments {
  float mean[kMaxChannels];
  double square[kMaxChannels];
};
channel_moments ChannelMoments(const float* window, const window_shape& shape);

// Mean over the channels of the normalised cross-correlation of two windows, -1 to 1:
//   (n S(xy) - S(x) S(y)) / sqrt((n S(xx) - S(x)^2) (n S(yy) - S(y)^2)).
// A channel that is flat in either adds 0, and counts. The first window's moments may be given.
float NormalisedCorrelation(const window_shape& shape, const float* first, const float* second);
float NormalisedCorrelation(const window_shape& shape, const float* first,
                            const channel_moments& first_moments, const float* second);

// 0 if in every channel the root mean square of the template is at least `threshold`, so that
// colour correction and correlation mean something. Else the 1-based channel to trust. Of three
// channels it is the brighter of the two that follow the first dark one in cyclic order (the second
// and third for channel 1, the third and first for channel 2), the earlier of these on a tie. Of
// another number it is the brightest one.
std::size_t FindPrimaryChannel(const float* template_plane, const window_shape& shape,
                               float threshold);

}  // namespace marrow::tracking
