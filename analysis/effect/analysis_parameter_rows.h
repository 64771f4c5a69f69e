#pragma once

#include <cstdint>

#include "effect/parameter_row.h"

// The parameters of every effect that analyses its input. Such an effect decides where they stand
// among its own, so here they go by ids of their own.
namespace kelp::analysis::effect {

enum AnalysisParam : std::int32_t {
  kAnalyzeParam = -10000,
  kCancelParam,
  kDetailedAnalysisParam,
  kMaxCountParam,
  kPresmoothingParam,
  kPresmoothingFactorParam,
  kEigenRatioThresholdParam,
  kSelectorXRadiusParam,
  kSelectorYRadiusParam,
  kBorderParam,
  kMinEigParam,
  kMaxEigParam,
  kThresholdParam,
  kMinSpacingParam,
  kPyramidalLevelsParam,
  kTrackerXRadiusParam,
  kTrackerYRadiusParam,
  kMaxIterationsParam,
  kToleranceTranslationParam,
  kColorCorrectionTranslationParam,
  kAffineVerificationParam,
  kToleranceAffineParam,
  kToleranceColorLambdaParam,
  kToleranceColorDeltaParam,
  kColorCorrectionAffineParam,
  kToleranceMinCorrelationParam,
  kTolerancePrimaryColorParam,
  kKillTracksShorterThanParam,
  kShowTracksParam,
  kSaveTrackFileParam,
  kAnalysisStatusCounterParam,
  kAnalysisParamEnd
};

// Null for an id that is none of these.
const kelp::effect::ParameterRow* AnalysisParameterRow(std::int32_t id);

}  // namespace kelp::analysis::effect
