#include "stabilization/crop/cropper.h"

#include <boost/make_shared.hpp>
#include <cmath>
#include <stdexcept>

#include "stabilization/crop/crop_path.h"
#include "stabilization/crop/filled_mask_rect.h"
#include "stabilization/crop/outline_mask.h"

using namespace marrow::stabilization;

namespace {

constexpr float constant_window_sigma = 1000000.0f;
constexpr double max_seed = 1 << 24;  // the cross walks back to the mask pixel by pixel

// 0 for sizes that are none; far above any mask's limit for those past 64 bits.
std::uint64_t mask_size(double extent) {
  if (!(extent > 0)) return 0;
  return static_cast<std::uint64_t>(std::fmin(std::ceil(extent), 1e18));
}

mask_rect outline_rect(outline_mask& mask, const VarVector& warp, point2 origin) {
  draw_outline(mask, warp, origin);
  const std::int32_t c = (warp.cols - 1) / 2;
  const std::int32_t r = (warp.rows - 1) / 2;
  const point2 p = warp.vertex(c, r);
  const point2 q = warp.vertex(c + 1, r + 1);
  const double x = std::trunc((p.x + q.x) / 2 - origin.x);
  const double y = std::trunc((p.y + q.y) / 2 - origin.y);
  const auto width = static_cast<double>(mask.width());
  const auto height = static_cast<double>(mask.height());
  // "and" between the two tests of x is on purpose: a seed beside the mask is let through.
  if (!(y >= 1 && y < height - 1) || (x < 1 && x >= width - 1) || !(std::fabs(x) < max_seed)) {
    throw std::runtime_error("Unknown cropping error 1");
  }
  const auto seed_x = static_cast<std::int64_t>(x);
  const auto seed_y = static_cast<std::int64_t>(y);
  if (mask.at(seed_x, seed_y)) throw std::runtime_error("Unknown cropping error 2");
  mask_rect rect = grow_cross(mask, seed_x, seed_y);
  shrink_to_clear(mask, seed_x, seed_y, rect);
  return rect;
}

}  // namespace

void cropper::computeFrameRect(std::size_t frame, const VarVector& warp, point2 boundsOrigin,
                               bool outlineCrop) {
  outline_mask mask(static_cast<std::int64_t>(maskWidth), static_cast<std::int64_t>(maskHeight));
  mask_rect rect;
  if (outlineCrop) {
    rect = outline_rect(mask, warp, boundsOrigin);
  } else {
    fill_cells(mask, warp, boundsOrigin);
    rect = largest_set_rect(mask);
  }
  rects.at(frame) = {static_cast<float>(rect.left), static_cast<float>(rect.right),
                     static_cast<float>(rect.top), static_cast<float>(rect.bottom)};
}

void cropper::cropper_smooth_rects(bool bilateral, float sigma, float bilateral_sigma,
                                   bool constant) {
  const crop_size size = smooth_crop_path(rects, bilateral, sigma, bilateral_sigma, constant);
  cropWidth = size.width;
  cropHeight = size.height;
}

boost::shared_ptr<cropper> RunCropper(
    const SolverParamsRecord& parameters, std::size_t frameCount,
    const std::function<boost::shared_ptr<const VarVector>(std::size_t)>& warp_of,
    const frame_bounds& unionBounds, bool boundsEmpty, const progress_functor& progress) {
  const auto result =
      boost::make_shared<cropper>(frameCount, mask_size(unionBounds.max_x - unionBounds.min_x),
                                  mask_size(unionBounds.max_y - unionBounds.min_y));
  if (boundsEmpty) return result;
  for (std::size_t f = 0; f < frameCount; ++f) {
    result->computeFrameRect(f, *warp_of(f), {unionBounds.min_x, unionBounds.min_y},
                             parameters.use_frame_bounds);
    progress();
  }
  result->cropper_smooth_rects(
      parameters.path_bilateral_sigma > 0.1f, parameters.path_gaussian_sigma,
      parameters.path_bilateral_sigma,
      parameters.no_motion || parameters.path_gaussian_sigma == constant_window_sigma);
  return result;
}
