#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <vector>

#include "apps/report/camera_path.h"
#include "host/stabilize/solved_clip.h"

namespace calmframe::report {

// What a clip's tracks and warps tell, a row a frame, or a field where the clip is interlaced.
struct SolveFigures {
  std::string row = "frame";  // what one is
  // Motions from a row to the next: of the picture as shot, and as warped.
  std::vector<std::optional<FrameMotion>> before, after;
  std::vector<int> tracked, begun, lost;  // features; lost: that the next row no longer has
  std::size_t track_life = 0;             // rows, of the median track
  // Centre of the crop window from the frame's centre, pixels; empty without a crop.
  std::vector<Point> window;
  int crop_width = 0, crop_height = 0;  // square pixels
  int width = 0, height = 0;            // of a frame in square pixels
};

// `clip`: its tracks may be none, its vertices any numbers.
SolveFigures FiguresOf(const host::SolvedClip& clip);

}  // namespace calmframe::report
