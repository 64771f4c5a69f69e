#pragma once

#include <cstddef>
#include <string_view>

#include "platform/hx/hx_pixel.h"

namespace calmframe {

// Writes a word in white on black at the top left of a picture of `width` x `height` pixels, a
// twentieth of its height tall; what does not fit is left out. Letters: A D E H K S T Y.
void DrawCaption(std::string_view word, HX_Pixel8* pixels, std::size_t row_pixels, int width,
                 int height);

}  // namespace calmframe
