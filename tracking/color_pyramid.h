#pragma once

#include <vector>

#include "tracking/frame_preparation.h"
#include "tracking/image_pyramid.h"

namespace marrow::tracking {

// ColorFromArgb to level 0 and BuildLevels in one pass over the frame, with the same result: a row
// is reduced while it is in the cache, and a large level 0 goes past the cache to memory. The
// pyramid has three channels and the frame's size.
void ColorPyramidFromArgb(const ArgbFrame& frame, ImagePyramid& pyramid,
                          std::vector<float>& scratch);

}  // namespace marrow::tracking
