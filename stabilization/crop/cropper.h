#pragma once

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <functional>
#include <vector>

#include "stabilization/progress.h"
#include "stabilization/solver_params.h"
#include "stabilization/warp/var_vector.h"

namespace marrow::stabilization {
class CPWarper;
}

// One frame's rectangle, in mask coordinates: x - unionBounds.min_x, y - unionBounds.min_y. right
// and bottom are inclusive.
struct crop_rect {
  float left = 0;
  float right = 0;
  float top = 0;
  float bottom = 0;
};

// The clip's crop window: one size for the whole clip, following a smooth path.
class cropper {
 public:
  cropper(std::size_t frameCount, std::uint64_t mask_width, std::uint64_t mask_height)
      : maskWidth(mask_width), maskHeight(mask_height), rects(frameCount) {}

  // Finds the rectangle that lies wholly inside the frame's warped outline (outlineCrop) or the
  // largest one inside its filled cells, and writes it into rects[frame]. boundsOrigin: the union
  // bounds' minimum. Throws std::runtime_error "Unknown cropping error 1" or "Unknown cropping
  // error 2" where the frame's centre lies outside or on its own outline, that is where a warp has
  // folded, and std::length_error where the mask would not fit in memory.
  void computeFrameRect(std::size_t frame, const marrow::stabilization::VarVector& warp,
                        marrow::stabilization::point2 boundsOrigin, bool outlineCrop);

  // Gives all frames one size along a smooth path; see stabilization/crop/crop_path.h.
  void cropper_smooth_rects(bool bilateral, float sigma, float bilateral_sigma, bool constant);

  std::uint64_t maskWidth;
  std::uint64_t maskHeight;
  std::int32_t cropWidth = 0;    // 0 until computed, and where the frames have nothing in common;
  std::int32_t cropHeight = 0;   // may come out below 0 where the path leaves the frames
  std::vector<crop_rect> rects;  // one a frame
};

// Finds the clip's crop window from the warper's records. Throws what computeFrameRect and
// `progress` throw; `progress` is called after each frame.
boost::shared_ptr<cropper> RunCropper(const marrow::stabilization::SolverParamsRecord& parameters,
                                      std::size_t frameCount,
                                      const marrow::stabilization::CPWarper& warper,
                                      const marrow::stabilization::progress_functor& progress);

// The same over plain records: `warp_of` a frame, `unionBounds` and `boundsEmpty` as the warper has
// them.
boost::shared_ptr<cropper> RunCropper(
    const marrow::stabilization::SolverParamsRecord& parameters, std::size_t frameCount,
    const std::function<boost::shared_ptr<const marrow::stabilization::VarVector>(std::size_t)>&
        warp_of,
    const marrow::stabilization::frame_bounds& unionBounds, bool boundsEmpty,
    const marrow::stabilization::progress_functor& progress);
