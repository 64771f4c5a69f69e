#pragma once

#include <cstdint>

namespace marrow::tracking {

// Settings of the tracker. Field names are also the persisted keys. Tolerances are narrowed to
// 32-bit floats for a run.
struct TrackerParams {
  std::uint64_t max_iterations = 25;  // at one level
  double tolerance_translation =
      0.1;  // stop when each translation step is under this, pixels of the level
  double tolerance_affine = 0.05;  // stop when each of the four matrix steps is under this
  std::uint64_t pyramidal_levels = 5;
  std::uint64_t half_win_x = 7;  // half side of the square tracking window
  std::uint64_t half_win_y = 7;  // kept, persisted and hashed, not used
  std::int32_t color_correction_translation =
      0;  // colour mode: 0 none, 2 joint gain and bias, 3 regressed gain and bias
  std::int32_t color_correction_affine = 2;
  bool affine_verification = true;
  double tolerance_color_lambda = 0.05;  // stop when each log-gain step is under this
  double tolerance_color_delta =
      1.0;  // stop when each bias step is under this, on the 0 to 255 scale
  double tolerance_min_correlation = 0.7;  // correlation under which a feature fails
  double tolerance_primary_color_threshold =
      5.0;  // RMS level under which a channel counts as too dark; 0 is off
  std::int32_t kill_tracks_shorter_than = 0;  // limit of RemoveShortTracks; 0 is off
};

}  // namespace marrow::tracking
