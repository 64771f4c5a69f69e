#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "apps/calmframe/steady_clip.h"
#include "apps/report/camera_path.h"

namespace calmframe {

// What a clip's tracks and warps tell, a row a frame, or a field where the clip is interlaced.
struct SolvedClip {
  // Motions from a row to the next: of the picture as shot, and as warped.
  std::vector<std::optional<report::FrameMotion>> before, after;
  std::vector<int> tracked, begun, lost;  // features; lost: that the next row no longer has
  // Centre of the crop window from the frame's centre, pixels; empty without a crop.
  std::vector<report::Point> window;
  int crop_width = 0, crop_height = 0;  // square pixels
  int width = 0, height = 0;            // of a frame in square pixels
};

// Of a clip that is solved, opened with `experimental`. `shown`: what the user calls the work.
// Throws SolveFailure, media::Failure.
SolvedClip ReadSolve(SteadyClip& clip, const std::string& shown);

// The lines in which a solve's log tells each frame's model, by frame; later ones count.
std::vector<double> ScoresIn(const std::string& log, std::size_t frames);

}  // namespace calmframe
