#include "effect/source_shape.h"

#include <algorithm>
#include <cmath>

namespace kelp::effect {

std::uint32_t SourceShape::square_width() const {
  const double square = std::floor(static_cast<double>(std::max(width, 1)) *
                                       static_cast<double>(par_num) / static_cast<double>(par_den) +
                                   0.5);
  if (!(square >= 1.0)) return 1;  // also a ratio of 0 : 0
  return static_cast<std::uint32_t>(std::min(square, 4294967295.0));
}

std::uint32_t SourceShape::square_height() const {
  return static_cast<std::uint32_t>(std::max(height, 1));
}

float SourceShape::pixel_aspect() const {
  return static_cast<float>(static_cast<double>(square_width()) /
                            static_cast<double>(std::max(width, 1)));
}

}  // namespace kelp::effect
