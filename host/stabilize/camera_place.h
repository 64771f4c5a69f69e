#pragma once

#include <optional>
#include <span>
#include <vector>

#include "host/stabilize/measures.h"

namespace calmframe::host {

// How a picture moves from one frame to the next: p goes to turn * (p - centre) + centre + shift.
struct FrameMotion {
  double shift_x = 0, shift_y = 0;  // pixels
  double angle = 0;                 // radians, clockwise as seen
  double scale = 1;
};

// Of the background, from each frame to the next; in pixels of the source, so that what is enlarged
// moves as far as what is not.
std::vector<std::optional<FrameMotion>> MotionsOf(const ShownMotion& shown);

// Where the camera points, summed up from the first frame on: the opposite of how the picture
// moves.
struct CameraPlace {
  double x = 0, y = 0;  // pixels, to the right and down
  double angle = 0;     // degrees clockwise
  double zoom = 1;      // above 1: closer
};

// One more than the motions; a motion that is not known counts as none.
std::vector<CameraPlace> PathOf(std::span<const std::optional<FrameMotion>> motions);

}  // namespace calmframe::host
