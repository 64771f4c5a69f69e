#pragma once

#include <vector>

#include "tracking/frame_preparation.h"
#include "tracking/image_pyramid.h"

namespace marrow::tracking {

// Fills a pyramid that starts with bytes, of three channels and the frame's size, in one pass over
// the frame: a row is reduced while it is in the cache. Its levels of floats are those that
// BuildLevels makes of ColorFromArgb.
void ColorPyramidFromArgb(const ArgbFrame& frame, ImagePyramid& pyramid,
                          std::vector<float>& scratch);

}  // namespace marrow::tracking
