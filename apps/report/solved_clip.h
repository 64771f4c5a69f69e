#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <vector>

#include "apps/report/camera_path.h"
#include "apps/report/track_table.h"
#include "host/plugin/plugin_library.h"

namespace calmframe::report {

// What a clip's tracks and warps tell, a row a frame, or a field where the clip is interlaced.
struct SolvedClip {
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

// `block`: the effect's opaque data. pixel_aspect: width : height of one of the clip's. Null
// without a solve.
std::optional<SolvedClip> ReadSolve(const host::PluginExports& exports, const void* block,
                                    const TrackTable& tracks, double pixel_aspect);

}  // namespace calmframe::report
