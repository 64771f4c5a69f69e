#pragma once

#include <algorithm>
#include <array>
#include <cstddef>
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

// A row and the id under which an effect that analyses asks for it.
struct AnalysisRow {
  AnalysisParam id;
  kelp::effect::ParameterRow row;
};

// In the order of the ids. Disk ids stand in projects: none may change or be used again.
inline constexpr auto kAnalysisRows = [] {
  using kelp::effect::ButtonRow;
  using kelp::effect::CheckboxRow;
  using kelp::effect::Decimals;
  using kelp::effect::SliderRow;
  return std::to_array<AnalysisRow>({
      {kAnalyzeParam,
       ButtonRow(1, "$$$/kelp/analysis/parameter/name/AnalyzeButton=Analyze", 0x140)},
      {kCancelParam, ButtonRow(11, "$$$/kelp/analysis/parameter/name/CancelButton=Cancel", 0x140,
                               HX_PARAM_UI_DISABLED)},
      {kDetailedAnalysisParam,
       CheckboxRow(HX_DETAILED_ANALYSIS,
                   "$$$/kelp/analysis/parameter/name/DetailedAnalysis=Detailed Analysis", 0x142)},
      {kMaxCountParam,
       SliderRow(102, "Max Count, 0=auto", {0, 9999}, {100, 2000}, 0, Decimals(0), 0x40)},
      {kPresmoothingParam, CheckboxRow({110, 1}, "Presmoothing", 0x40)},
      {kPresmoothingFactorParam,
       SliderRow(111, "Presmoothing Factor", {0.001f, 2}, {0.001f, 1}, 0.1, Decimals(2), 0x40)},
      {kEigenRatioThresholdParam,
       SliderRow(113, "Eigen Ratio Threshold", {0, 100}, {0, 100}, 15, Decimals(2), 0x40)},
      {kSelectorXRadiusParam,
       SliderRow(104, "Selector X Radius, 0=auto", {0, 200}, {1, 50}, 0, Decimals(0), 0x40)},
      {kSelectorYRadiusParam,
       SliderRow(105, "Selector Y Radius, 0=auto", {0, 200}, {1, 50}, 0, Decimals(0), 0x40)},
      {kBorderParam, SliderRow(106, "Border Width to Avoid (pixels)", {1, 2000}, {1, 120}, 12,
                               Decimals(0), 0x40)},
      {kMinEigParam, SliderRow(108, "min_eig", {1, 10000}, {1, 100}, 1, Decimals(1), 0x40)},
      {kMaxEigParam, SliderRow(109, "max_eig", {1, 10000}, {4000, 10000}, 6000, Decimals(1), 0x40)},
      {kThresholdParam, SliderRow(107, "Threshold (screens out weak)", {0.001f, 1}, {0.01f, 1},
                                  0.01, Decimals(2), 0x40)},
      {kMinSpacingParam,
       SliderRow(103, "Min Spacing (pixels), 0=auto", {0, 200}, {0, 50}, 0, Decimals(0), 0x40)},
      {kPyramidalLevelsParam,
       SliderRow(123, "Pyramidal Levels", {1, 10}, {1, 10}, 5, Decimals(0), 0x40)},
      {kTrackerXRadiusParam,
       SliderRow(124, "Tracker X Radius, 0=auto", {0, 50}, {1, 30}, 0, Decimals(0), 0x40)},
      {kTrackerYRadiusParam,
       SliderRow(125, "Tracker Y Radius, 0=auto", {0, 50}, {1, 30}, 0, Decimals(0), 0x40)},
      {kMaxIterationsParam,
       SliderRow(120, "Max Iterations", {1, 100}, {1, 30}, 25, Decimals(0), 0x40)},
      {kToleranceTranslationParam,
       SliderRow(121, "Tolerance Translation", {0, 10}, {0, 1}, 0.1, Decimals(2), 0x40)},
      {kColorCorrectionTranslationParam,
       SliderRow(126, "Color Correction Trans (0,2)", {0, 2}, {0, 2}, 0, Decimals(0), 0x40)},
      {kAffineVerificationParam, CheckboxRow({128, 1}, "Affine Verification", 0x40)},
      {kToleranceAffineParam,
       SliderRow(122, "Tolerance Affine", {0, 10}, {0, 1}, 0.05, Decimals(2), 0x40)},
      {kToleranceColorLambdaParam,
       SliderRow(129, "Tolerance Color Lambda", {0, 10}, {0, 1}, 0.05, Decimals(2), 0x40)},
      {kToleranceColorDeltaParam,
       SliderRow(130, "Tolerance Color Delta", {0, 255}, {0, 10}, 1, Decimals(2), 0x40)},
      {kColorCorrectionAffineParam,
       SliderRow(127, "Color Correction Affine (0,2)", {0, 2}, {0, 2}, 2, Decimals(0), 0x40)},
      {kToleranceMinCorrelationParam,
       SliderRow(131, "Tolerance Min Corr., 0=auto", {-1, 1}, {0, 1}, 0, Decimals(2), 0x40)},
      {kTolerancePrimaryColorParam,
       SliderRow(133, "Tolerance Primary Color, 0=off", {0, 255}, {0, 64}, 5, Decimals(2), 0x40)},
      {kKillTracksShorterThanParam,
       SliderRow(295, "Prekill tracks shorter than:", {0, 200}, {0, 50}, 5, Decimals(0), 0x40)},
      {kShowTracksParam, CheckboxRow({280, 0}, "Show Tracks", 0x100)},
      {kSaveTrackFileParam, ButtonRow(290, "Save TRK file", 0x140)},
      {kAnalysisStatusCounterParam, SliderRow(302, "AnalysisStatusCounter", {0, 2e9f}, {0, 2000}, 0,
                                              Decimals(0), 0x102, HX_PARAM_UI_HIDDEN)},
  });
}();
static_assert(kAnalysisRows.size() == kAnalysisParamEnd - kAnalyzeParam);

// Null for an id that is none of these.
constexpr const kelp::effect::ParameterRow* AnalysisParameterRow(std::int32_t id) {
  if (id < kAnalyzeParam || id >= kAnalysisParamEnd) return nullptr;
  return &kAnalysisRows[static_cast<std::size_t>(id - kAnalyzeParam)].row;
}

static_assert(std::ranges::all_of(kAnalysisRows,
                                  [](const AnalysisRow& shared) {
                                    return AnalysisParameterRow(shared.id) == &shared.row;
                                  }),
              "each row stands at its id");

}  // namespace kelp::analysis::effect
