#include "stabilizer/effect/src/parameter_rules.h"

#include <algorithm>
#include <cmath>

namespace kelp::effect {

using marrow::stabilization::SolverParamsRecord;
using marrow::tracking::SelectorParams;
using marrow::tracking::TrackerParams;

std::uint32_t ClipGeometry::square_width() const {
  const double square =
      std::floor(static_cast<double>(width) * static_cast<double>(pixel_aspect_num) /
                     static_cast<double>(pixel_aspect_den) +
                 0.5);
  return static_cast<std::uint32_t>(std::max(square, 1.0));
}

float ClipGeometry::pixel_aspect() const {
  return static_cast<float>(static_cast<double>(square_width()) / static_cast<double>(width));
}

std::uint64_t WindowRule(std::uint32_t height, bool detailed) {
  const double clamped = std::clamp(static_cast<double>(height), 480.0, 1080.0);
  return static_cast<std::uint64_t>((clamped - 480.0) / 600.0 * 8.0 + 7.0) + (detailed ? 5 : 0);
}

SelectorParams MakeSelectorParams(const Controls& controls, const ClipGeometry& clip) {
  SelectorParams params;
  params.max_count = controls.detailed_analysis ? 2000 : 500;
  const double area_a_feature = static_cast<double>(clip.width) * static_cast<double>(clip.height) /
                                (5.0 * static_cast<double>(params.max_count));
  params.spacing =
      std::max<std::uint64_t>(4, static_cast<std::uint64_t>(std::sqrt(area_a_feature) + 0.5));
  params.half_winx = params.half_winy = WindowRule(clip.height, controls.detailed_analysis);
  params.threshold = 0.01f;
  return params;
}

TrackerParams MakeTrackerParams(const Controls& controls, const ClipGeometry& clip) {
  TrackerParams params;
  params.half_win_x = params.half_win_y = WindowRule(clip.height, controls.detailed_analysis);
  params.tolerance_min_correlation = controls.detailed_analysis ? 0.5 : 0.7;
  params.kill_tracks_shorter_than = 5;
  return params;
}

SolverParamsRecord MakeSolverParams(const Controls& controls, const ClipGeometry& clip) {
  SolverParamsRecord params;
  const bool enhanced = controls.rolling_shutter_ripple == RollingShutterRipple::enhanced_reduction;
  const double larger_side = std::max(clip.square_width(), clip.height);

  params.smoothness_lambda = 4.0 * controls.smoothness;
  params.transition_stab_lambda = params.smoothness_lambda * 0.5;
  params.conservative_threshold = enhanced ? 2.5 : 7.5;
  params.homography_limit = enhanced ? 100.0f : 50.0f;
  params.reconstruction_error_threshold =
      params._reconstruction_error_threshold_ratio * larger_side;
  params.reconstruction_error_third = params.reconstruction_error_threshold / 3.0;
  params.no_motion = controls.result == Result::no_motion;
  constexpr double kWarpFactor = 10.0;  // the hidden control's default: the plain method
  params.method_level =
      static_cast<float>(static_cast<int>(controls.method) - (1.0 - kWarpFactor / 10.0));
  params.pixel_aspect = clip.pixel_aspect();

  params.crop = crops(controls.framing);
  params.action_safe_margin = static_cast<float>(controls.action_safe_margin / 100.0);
  params.maximum_scale = controls.framing == Framing::crop_auto_scale
                             ? static_cast<float>(controls.maximum_scale / 100.0)
                             : 1.0f;

  // At half way or less the crop path follows two seconds of frames; towards 1 nearly twenty; at 1
  // the window stands still.
  const double more = controls.crop_less_smooth_more / 100.0;
  const double reach = std::min(2.0 * more, 1.0);
  params.path_bilateral_sigma = static_cast<float>(std::max(reach * reach * larger_side, 1.0));
  params.path_gaussian_sigma =
      more == 1.0 ? 1000000.0f
                  : static_cast<float>(((std::clamp(more, 0.5, 1.0) - 0.5) * 2.0 * 18.0 + 2.0) *
                                       clip.frame_rate);
  return params;
}

}  // namespace kelp::effect
