#pragma once

#include <cstdint>

namespace marrow::tracking {

// Settings of the feature selector. Field names are also the persisted keys. Lengths in pixels.
struct SelectorParams {
  std::uint64_t max_count = 500;  // slots a frame; the most features that one selection returns
  std::uint64_t spacing = 10;     // minimum distance between features
  std::uint64_t half_winx = 5;    // window of the gradient sums: 2 * half_winx + 1 wide
  std::uint64_t half_winy = 5;
  std::uint64_t border = 12;  // strip along each image edge in which no feature is selected
  float threshold = 0.02f;    // fraction of the best score under which candidates are dropped
  float min_eig = 1.0f;       // absolute floor of the score, per window pixel
  float max_eig = 6000.0f;    // cap on the best score for the relative threshold, per window pixel
  bool presmoothing = true;   // smooth the luma before the gradients
  float presmooth_factor = 0.1f;      // Gaussian sigma as a fraction of the window's side
  float eig_ratio_threshold = 15.0f;  // most allowed ratio of the larger to the smaller eigenvalue
};

}  // namespace marrow::tracking
