#pragma once

#include <optional>
#include <span>

#include "host/stabilize/camera_place.h"
#include "host/stabilize/similarity.h"

namespace calmframe::report {

using host::CameraPlace;
using host::FrameMotion;
using host::Point;  // pixels, y down

// One feature in two frames that follow each other.
struct Match {
  Point from, to;
};

// The similarity that most matches agree with: least squares, weighted anew by Tukey's biweight
// (1974) of the residuals over their median until it stands. Null with fewer than 3 matches and
// where they lie on one point.
std::optional<FrameMotion> FitMotion(std::span<const Match> matches, Point centre);

// Standard deviation of the path's second differences, pixels a frame squared: what a viewer sees
// as shake. 0 for fewer than three places.
double ShakeOf(std::span<const CameraPlace> path);

}  // namespace calmframe::report
