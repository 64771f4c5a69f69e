#pragma once

#include <cstdint>
#include <vector>

#include "tracking/frame_preparation.h"
#include "tracking/image_pyramid.h"

namespace marrow::tracking {

// Fills a pyramid that starts with bytes, of three channels and the frame's size, and the frame's
// luma, in one pass over the frame: a row is reduced while it is in the cache. The levels of floats
// are those that BuildLevels makes of ColorFromArgb. True if the frame's whole mask would be 1.
bool ColorPyramidFromArgb(const ArgbFrame& frame, ImagePyramid& pyramid,
                          std::vector<float>& scratch, std::uint8_t* luma);

}  // namespace marrow::tracking
