#pragma once

#include <string>

#include "examples/outside_renderer/drawing/frame_drawer.h"
#include "platform/hx/hx_world.h"

namespace outside {

// Of two pictures of one frame.
struct Comparison {
  int largest = 0;   // difference of a channel, in 255ths, away from the rim
  double share = 0;  // of the picture that is away from the rim
};

// Of a world of HX_Pixel8.
Picture CopyOf(const HX_World& world);

// Away from the rim is where `theirs` and all that is within 4 pixels of it is not clear; outside
// the picture all is. Pictures of two sizes differ by 255.
Comparison Compare(const Picture& theirs, const Picture& ours);

// Both beside each other, as PPM. Throws std::runtime_error.
void WriteBeside(const std::string& path, const Picture& theirs, const Picture& ours);

}  // namespace outside
