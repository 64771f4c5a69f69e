#pragma once

#include <memory>
#include <string_view>

#include "host/pixels/world_buffer.h"

namespace calmframe {

// A word in white on black, a twentieth as tall as the picture that it is for, in ARGB of 8 bits.
// Letters: A D E H K S T Y.
std::unique_ptr<host::WorldBuffer> Caption(std::string_view word, int picture_height);

}  // namespace calmframe
