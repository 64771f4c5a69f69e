#include "analysis/effect/analysis_parameter_rules.h"

#include <algorithm>
#include <cmath>

#include "analysis/effect/analysis_parameter_rows.h"

namespace kelp::analysis::effect {

using kelp::effect::ParameterReader;
using marrow::tracking::SelectorParams;
using marrow::tracking::TrackerParams;

namespace {

std::uint64_t Count(const ParameterReader& params, std::int32_t id) {
  return static_cast<std::uint64_t>(std::max(params.GetIntParam(id), 0));
}

float Float(const ParameterReader& params, std::int32_t id) {
  return static_cast<float>(params.GetFloatParam(id));
}

}  // namespace

std::uint64_t WindowRule(std::uint32_t height, bool detailed) {
  const double clamped = std::clamp(static_cast<double>(height), 480.0, 1080.0);
  return static_cast<std::uint64_t>((clamped - 480.0) / 600.0 * 8.0 + 7.0) + (detailed ? 5 : 0);
}

SelectorParams GetSelectorParams(const ParameterReader& params, std::uint32_t width,
                                 std::uint32_t height) {
  const bool detailed = params.GetBoolParam(kDetailedAnalysisParam);
  SelectorParams selector;
  selector.max_count = Count(params, kMaxCountParam);
  if (selector.max_count == 0) selector.max_count = detailed ? 2000 : 500;
  selector.spacing = Count(params, kMinSpacingParam);
  if (selector.spacing == 0) {
    const double area_a_feature = static_cast<double>(width) * static_cast<double>(height) /
                                  (5.0 * static_cast<double>(selector.max_count));
    selector.spacing =
        std::max<std::uint64_t>(4, static_cast<std::uint64_t>(std::sqrt(area_a_feature) + 0.5));
  }
  selector.half_winx = Count(params, kSelectorXRadiusParam);
  if (selector.half_winx == 0) selector.half_winx = WindowRule(height, detailed);
  selector.half_winy = Count(params, kSelectorYRadiusParam);
  if (selector.half_winy == 0) selector.half_winy = WindowRule(height, detailed);
  selector.border = Count(params, kBorderParam);
  selector.threshold = Float(params, kThresholdParam);
  selector.min_eig = Float(params, kMinEigParam);
  selector.max_eig = Float(params, kMaxEigParam);
  selector.presmoothing = params.GetBoolParam(kPresmoothingParam);
  selector.presmooth_factor = Float(params, kPresmoothingFactorParam);
  selector.eig_ratio_threshold = Float(params, kEigenRatioThresholdParam);
  return selector;
}

TrackerParams GetTrackerParams(const ParameterReader& params, std::uint32_t height) {
  const bool detailed = params.GetBoolParam(kDetailedAnalysisParam);
  TrackerParams tracker;
  tracker.max_iterations = Count(params, kMaxIterationsParam);
  tracker.tolerance_translation = params.GetFloatParam(kToleranceTranslationParam);
  tracker.tolerance_affine = params.GetFloatParam(kToleranceAffineParam);
  tracker.pyramidal_levels = Count(params, kPyramidalLevelsParam);
  tracker.half_win_x = Count(params, kTrackerXRadiusParam);
  if (tracker.half_win_x == 0) tracker.half_win_x = WindowRule(height, detailed);
  tracker.half_win_y = Count(params, kTrackerYRadiusParam);
  if (tracker.half_win_y == 0) tracker.half_win_y = WindowRule(height, detailed);
  tracker.color_correction_translation = params.GetIntParam(kColorCorrectionTranslationParam);
  tracker.color_correction_affine = params.GetIntParam(kColorCorrectionAffineParam);
  tracker.affine_verification = params.GetBoolParam(kAffineVerificationParam);
  tracker.tolerance_color_lambda = params.GetFloatParam(kToleranceColorLambdaParam);
  tracker.tolerance_color_delta = params.GetFloatParam(kToleranceColorDeltaParam);
  tracker.tolerance_min_correlation = params.GetFloatParam(kToleranceMinCorrelationParam);
  if (tracker.tolerance_min_correlation == 0) {
    tracker.tolerance_min_correlation = detailed ? 0.5 : 0.7;
  }
  tracker.tolerance_primary_color_threshold = params.GetFloatParam(kTolerancePrimaryColorParam);
  tracker.kill_tracks_shorter_than = params.GetIntParam(kKillTracksShorterThanParam);
  return tracker;
}

}  // namespace kelp::analysis::effect
