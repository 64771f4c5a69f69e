#include "stabilizer/effect/src/parameter_rules.h"

#include <algorithm>

#include "stabilizer/effect/src/parameter_table.h"
#include "stabilizer/render/framing.h"

namespace kelp::effect {

using marrow::render::Framing;
using marrow::stabilization::SolverParamsRecord;

SolverParamsRecord GetSolverParams(const ParameterReader& params, const SourceShape& source,
                                   double frame_rate) {
  const auto real = [&params](std::int32_t index) {
    return static_cast<float>(params.GetFloatParam(index));
  };
  const bool enhanced = params.GetPopupParam(kRollingShutterRippleIndex) ==
                        static_cast<int>(RollingShutterRipple::enhanced_reduction);
  const auto framing = static_cast<Framing>(params.GetPopupParam(kFramingIndex));
  const double larger_side = std::max(source.square_width(), source.square_height());
  SolverParamsRecord record;

  record.rank = params.GetIntParam(kRankIndex);
  record.duration = params.GetIntParam(kWindowDurationIndex);
  record.step = params.GetIntParam(kWindowStepIndex);
  record.min_duration = params.GetIntParam(kMinDurationIndex);
  record.kernel_size = params.GetIntParam(kKernelSizeIndex);
  record.short_trajectory_duration = params.GetIntParam(kShortTrajectoryDurationIndex);
  record.track_fade_duration = params.GetIntParam(kTrackFadeDurationIndex);
  record.track_fade_minimum = params.GetIntParam(kTrackFadeMinimumIndex);
  record.smoothness_lambda = 4.0 * params.GetFloatParam(kSmoothnessIndex);
  record.conservative_factorization = params.GetBoolParam(kConservativeFactorizationIndex);
  record.conservative_threshold = params.GetFloatParam(kConservativeThresholdIndex);
  if (record.conservative_threshold == 0) record.conservative_threshold = enhanced ? 2.5 : 7.5;
  record._reconstruction_error_threshold_ratio = params.GetFloatParam(kMaxReprojectionErrorIndex);
  record.reconstruction_error_threshold =
      record._reconstruction_error_threshold_ratio * larger_side;
  record.reconstruction_error_third = record.reconstruction_error_threshold / 3.0;
  record.max_factorization_frames = params.GetIntParam(kMaxFactorizationFramesIndex);
  record.factorization_window_overlap = params.GetIntParam(kFactorizationWindowOverlapIndex);

  record.max_transition_iterations = params.GetIntParam(kMaxTransitionIterationsIndex);
  record.transition_window_overlap = params.GetIntParam(kTransitionWindowOverlapIndex);
  record.transition_bisquare_sigma = params.GetFloatParam(kTransitionBisquareSigmaIndex);
  record.use_new_solver = params.GetBoolParam(kUseNewSolverIndex);
  record.transition_max_duration = params.GetIntParam(kTransitionMaxDurationIndex);
  record.transition_stab_lambda = params.GetFloatParam(kTransitionStabLambdaIndex);
  if (record.transition_stab_lambda == 0) {
    record.transition_stab_lambda = record.smoothness_lambda * 0.5;
  }
  record.transition_fade_duration = params.GetIntParam(kTransitionFadeDurationIndex);

  record.no_motion = params.GetPopupParam(kResultIndex) == static_cast<int>(Result::no_motion);
  record.homography_limit = real(kHomographyLimitIndex);
  if (record.homography_limit == 0) record.homography_limit = enhanced ? 100.0f : 50.0f;
  record.method_level = static_cast<float>(params.GetPopupParam(kMethodIndex) -
                                           (1.0 - params.GetFloatParam(kWarpFactorIndex) / 10.0));
  record.pixel_aspect = source.pixel_aspect();

  record.crop = crops(framing);
  record.action_safe_margin =
      static_cast<float>(params.GetFloatParam(kActionSafeMarginIndex) / 100.0);
  record.maximum_scale = framing == Framing::crop_auto_scale
                             ? static_cast<float>(params.GetFloatParam(kMaximumScaleIndex) / 100.0)
                             : 1.0f;

  // At half way or less the crop path follows two seconds of frames; towards 1 nearly twenty; at 1
  // the window stands still.
  const double more = params.GetFloatParam(kCropLessSmoothMoreIndex) / 100.0;
  record.path_bilateral_sigma = real(kPathBilateralSigmaIndex);
  if (record.path_bilateral_sigma == 0) {
    const double reach = std::min(2.0 * more, 1.0);
    record.path_bilateral_sigma = static_cast<float>(std::max(reach * reach * larger_side, 1.0));
  }
  record.path_gaussian_sigma = real(kPathGaussianSigmaIndex);
  if (record.path_gaussian_sigma == 0) {
    record.path_gaussian_sigma =
        more == 1.0 ? 1000000.0f
                    : static_cast<float>(((std::clamp(more, 0.5, 1.0) - 0.5) * 2.0 * 18.0 + 2.0) *
                                         frame_rate);
  }
  return record;
}

}  // namespace kelp::effect
