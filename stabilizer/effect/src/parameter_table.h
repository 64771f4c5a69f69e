#pragma once

#include <cstdint>

#include "effect/parameter_row.h"

// All parameters of the stabilizer by index, 0 being the host's input layer. A parameter has an
// index; a disk id, which projects store; and, if every analysing effect has it, the id of
// kelp::analysis::effect::AnalysisParam. Where an id is asked for, an index does as well.
namespace kelp::effect {

inline constexpr std::int32_t kParamCount = 98;
// From here on: declared only with the debug option "ShowExperimentalEffectParameters".
inline constexpr std::int32_t kFirstExperimentalIndex = HX_FIRST_EXPERIMENTAL;
inline constexpr std::int32_t kNoParam = -1;

enum ParamIndex : std::int32_t {
  kAnalyzeIndex = 1,
  kCancelIndex = 2,
  kStabilizationGroupIndex = 3,
  kResultIndex = 4,
  kSmoothnessIndex = 5,
  kMethodIndex = 6,
  kFramingIndex = 9,
  kAutoScaleGroupIndex = 10,
  kMaximumScaleIndex = 11,
  kActionSafeMarginIndex = 12,
  kAdditionalScaleIndex = 14,
  kDetailedAnalysisIndex = 17,
  kRollingShutterRippleIndex = 18,
  kCropLessSmoothMoreIndex = 19,
  kSynthesisInputRangeIndex = 20,
  kSynthesisEdgeFeatherIndex = 21,
  kSynthesisEdgeCroppingIndex = 22,
  kSynthesisLeftIndex = 23,
  kSynthesisTopIndex = 24,
  kSynthesisRightIndex = 25,
  kSynthesisBottomIndex = 26,
  kHideWarningBannerIndex = 28,
  kAnalysisStatusCounterIndex = 30,
  kRankIndex = 59,
  kWindowDurationIndex = 60,
  kWindowStepIndex = 61,
  kMinDurationIndex = 62,
  kKernelSizeIndex = 63,
  kShortTrajectoryDurationIndex = 64,
  kMaxReprojectionErrorIndex = 65,
  kTrackFadeDurationIndex = 66,
  kTrackFadeMinimumIndex = 67,
  kMaxFactorizationFramesIndex = 68,
  kMaxTransitionIterationsIndex = 69,
  kFactorizationWindowOverlapIndex = 70,
  kTransitionWindowOverlapIndex = 71,
  kTransitionBisquareSigmaIndex = 72,
  kUseNewSolverIndex = 73,
  kTransitionMaxDurationIndex = 74,
  kTransitionStabLambdaIndex = 75,
  kTransitionFadeDurationIndex = 76,
  kConservativeFactorizationIndex = 77,
  kConservativeThresholdIndex = 78,
  kHomographyLimitIndex = 79,
  kPathGaussianSigmaIndex = 80,
  kPathBilateralSigmaIndex = 81,
  kWarpFactorIndex = 83,
  kDeblurIndex = 84,
  kDeblurFrameRangeIndex = 85,
  kDeblurFrameThresholdIndex = 86,
  kDeblurComparisonBlurIndex = 87,
  kDeblurPixelThresholdIndex = 88,
  kDeblurPixelSoftnessIndex = 89,
  kShowDeblurMapIndex = 90,
  kDeblurDebugIndex = 91,
  kAlignedFrameIndex = 92,
  kSynthesisAlphaBoostIndex = 93,
  kShowTracksIndex = 95
};

// The value of each popup's items.
enum class Result { smooth_motion = 1, no_motion = 2 };
enum class Method { position = 1, position_scale_rotation = 2, perspective = 3, subspace_warp = 4 };
enum class RollingShutterRipple { automatic_reduction = 1, enhanced_reduction = 2 };

// kNoParam for an id that is none of AnalysisParam.
std::int32_t ParamIdToIndex(std::int32_t id);
// The reverse; kNoParam for an index without such an id, and for the status counter, which nobody
// looks up this way.
std::int32_t IndexToParamId(std::int32_t index);

inline bool IsExperimentalIndex(std::int32_t index) {
  return index >= kFirstExperimentalIndex && index < kParamCount;
}

// Null for index 0 and for what lies outside.
const ParameterRow* ParameterTableRow(std::int32_t index);

// By index or id; 0 for anything else.
double GetParamDefault(std::int32_t id);

}  // namespace kelp::effect
