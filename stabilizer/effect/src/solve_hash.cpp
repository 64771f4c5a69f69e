#include "stabilizer/effect/src/solve_hash.h"

#include <cstddef>
#include <cstring>
#include <type_traits>

#include "platform/tessel/utility.h"

namespace kelp::effect {
namespace {

template <class... Fields>
std::uint32_t HashOf(const Fields&... fields) {
  static_assert((std::is_arithmetic_v<Fields> && ...));
  std::byte packed[(sizeof(Fields) + ...)];
  std::byte* at = packed;
  ((std::memcpy(at, &fields, sizeof fields), at += sizeof fields), ...);
  return tessel::utility::CRC32(packed, sizeof packed);
}

}  // namespace

std::uint32_t SolveHash(const marrow::stabilization::SolverParamsRecord& params) {
  const std::uint32_t hash = HashOf(
      params.rank, params.duration, params.step, params.min_duration, params.kernel_size,
      params.short_trajectory_duration, params.track_fade_duration, params.track_fade_minimum,
      params.smoothness_lambda, params.conservative_factorization, params.conservative_threshold,
      params._reconstruction_error_threshold_ratio, params.reconstruction_error_third,
      params.max_factorization_frames, params.max_transition_iterations,
      params.transition_min_observations, params.transition_bisquare_sigma, params.use_new_solver,
      params.transition_max_duration, params.transition_stab_lambda,
      params.transition_fade_duration, params.factorization_window_overlap,
      params.transition_window_overlap, params.no_motion, params.homography_limit,
      params.method_level);
  // Projects of square pixels keep the hash that they had before there was such a field.
  if (params.pixel_aspect == 1.0f) return hash;
  return tessel::utility::CRC32(&params.pixel_aspect, sizeof params.pixel_aspect, hash);
}

std::uint32_t CropHash(const marrow::stabilization::SolverParamsRecord& params) {
  return HashOf(params.action_safe_margin, params.maximum_scale, params.crop,
                params.path_gaussian_sigma, params.path_bilateral_sigma, params.crop_constant,
                params.use_frame_bounds);
}

}  // namespace kelp::effect
