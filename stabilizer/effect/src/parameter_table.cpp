#include "stabilizer/effect/src/parameter_table.h"

#include <algorithm>
#include <array>
#include <cstddef>

#include "analysis/effect/analysis_parameter_rows.h"
#include "stabilizer/effect/src/stabilizer_strings.h"

namespace kelp::effect {

using namespace analysis::effect;

namespace {

struct TableRow {
  std::int32_t index;
  ParameterRow row;
  std::int32_t id = kNoParam;  // of AnalysisParam
};

// A row of every analysing effect.
constexpr TableRow Shared(std::int32_t index, AnalysisParam id) {
  return {index, *AnalysisParameterRow(id), id};
}

// Disk ids stand in projects: none may change or be used again.
constexpr auto kTable = std::to_array<TableRow>({
    {0, {}},  // the layer
    Shared(kAnalyzeIndex, kAnalyzeParam),
    Shared(kCancelIndex, kCancelParam),
    {kStabilizationGroupIndex, GroupStartRow(12, kStringStabilization)},
    {kResultIndex, PopupRow(HX_RESULT, kStringResult, kStringResultItems, 0x102)},
    {kSmoothnessIndex, SliderRow(HX_SMOOTHNESS, kStringSmoothness, {0, 100}, kPercent, 0x122)},
    {kMethodIndex, PopupRow(HX_METHOD, kStringMethod, kStringMethodItems, 0x102)},
    {7, GroupEndRow(13)},
    {8, GroupStartRow(8, kStringBorders)},
    {kFramingIndex, PopupRow(HX_FRAMING, kStringFraming, kStringFramingItems, 0x102)},
    {kAutoScaleGroupIndex, GroupStartRow(17, kStringAutoScale, HX_PARAM_FLAG_CLOSED)},
    {kMaximumScaleIndex,
     SliderRow(HX_MAXIMUM_SCALE, kStringMaximumScale, {100, 200}, kPercent, 0x122)},
    {kActionSafeMarginIndex,
     SliderRow(HX_ACTION_SAFE_MARGIN, kStringActionSafeMargin, {0, 20}, kPercent, 0x122)},
    {13, GroupEndRow(18)},
    {kAdditionalScaleIndex,
     SliderRow(HX_ADDITIONAL_SCALE, kStringAdditionalScale, {0, 200}, kPercent, 0x100)},
    {15, GroupEndRow(9)},
    {16, GroupStartRow(24, kStringAdvanced, HX_PARAM_FLAG_CLOSED)},
    Shared(kDetailedAnalysisIndex, kDetailedAnalysisParam),
    {kRollingShutterRippleIndex, PopupRow(HX_ROLLING_SHUTTER_RIPPLE, kStringRollingShutterRipple,
                                          kStringRollingShutterRippleItems, 0x102)},
    {kCropLessSmoothMoreIndex,
     SliderRow(HX_CROP_LESS_SMOOTH_MORE, kStringCropLessSmoothMore, {0, 100}, kPercent, 0x122)},
    {kSynthesisInputRangeIndex, SliderRow(HX_SYNTHESIS_INPUT_RANGE, kStringSynthesisInputRange,
                                          {0.01f, 5}, Decimals(2), 0x122)},
    {kSynthesisEdgeFeatherIndex, SliderRow(HX_SYNTHESIS_EDGE_FEATHER, kStringSynthesisEdgeFeather,
                                           {0, 20}, Decimals(0), 0x120)},
    {kSynthesisEdgeCroppingIndex,
     GroupStartRow(29, kStringSynthesisEdgeCropping, HX_PARAM_FLAG_CLOSED)},
    {kSynthesisLeftIndex, SliderRow(31, kStringLeft, {0, 999}, {0, 20}, 0, Decimals(0), 0x120)},
    {kSynthesisTopIndex, SliderRow(32, kStringTop, {0, 999}, {0, 20}, 0, Decimals(0), 0x120)},
    {kSynthesisRightIndex, SliderRow(33, kStringRight, {0, 999}, {0, 20}, 0, Decimals(0), 0x120)},
    {kSynthesisBottomIndex, SliderRow(34, kStringBottom, {0, 999}, {0, 20}, 0, Decimals(0), 0x120)},
    {27, GroupEndRow(30)},
    {kHideWarningBannerIndex, CheckboxRow(HX_HIDE_WARNING_BANNER, kStringHideWarningBanner, 0x102)},
    {29, GroupEndRow(25)},
    Shared(kAnalysisStatusCounterIndex, kAnalysisStatusCounterParam),
    {31, GroupStartRow(100, "Experimental", HX_PARAM_FLAG_CLOSED)},
    {32, GroupStartRow(101, "Trackers", HX_PARAM_FLAG_CLOSED)},
    Shared(33, kMaxCountParam),
    Shared(34, kPresmoothingParam),
    Shared(35, kPresmoothingFactorParam),
    Shared(36, kEigenRatioThresholdParam),
    Shared(37, kSelectorXRadiusParam),
    Shared(38, kSelectorYRadiusParam),
    Shared(39, kBorderParam),
    Shared(40, kMinEigParam),
    Shared(41, kMaxEigParam),
    Shared(42, kThresholdParam),
    Shared(43, kMinSpacingParam),
    Shared(44, kPyramidalLevelsParam),
    Shared(45, kTrackerXRadiusParam),
    Shared(46, kTrackerYRadiusParam),
    Shared(47, kMaxIterationsParam),
    Shared(48, kToleranceTranslationParam),
    Shared(49, kColorCorrectionTranslationParam),
    Shared(50, kAffineVerificationParam),
    Shared(51, kToleranceAffineParam),
    Shared(52, kToleranceColorLambdaParam),
    Shared(53, kToleranceColorDeltaParam),
    Shared(54, kColorCorrectionAffineParam),
    Shared(55, kToleranceMinCorrelationParam),
    Shared(56, kTolerancePrimaryColorParam),
    {57, GroupEndRow(200)},
    {58, GroupStartRow(201, "Stabilization", HX_PARAM_FLAG_CLOSED)},
    {kRankIndex, SliderRow(203, "Rank", {1, 50}, {1, 100}, 9, Decimals(0), 0x100)},
    {kWindowDurationIndex,
     SliderRow(204, "Window Duration", {1, 500}, {1, 100}, 40, Decimals(0), 0x100)},
    {kWindowStepIndex, SliderRow(205, "Window Step", {1, 100}, {1, 5}, 5, Decimals(0), 0x100)},
    {kMinDurationIndex,
     SliderRow(206, "Ignore Trackers Shorter Than", {1, 200}, {1, 50}, 5, Decimals(0), 0x100)},
    {kKernelSizeIndex, SliderRow(207, "Kernel Size", {1, 400}, {1, 200}, 100, Decimals(0), 0x100,
                                 HX_PARAM_UI_DISABLED)},
    {kShortTrajectoryDurationIndex, SliderRow(208, "Short Trajectory Duration", {1, 200}, {1, 100},
                                              10, Decimals(0), 0x100, HX_PARAM_UI_DISABLED)},
    {kMaxReprojectionErrorIndex,
     SliderRow(209, "Max Reprojection Error", {0, 1}, {0, 0.1f}, 0.0045, Decimals(4), 0x100)},
    {kTrackFadeDurationIndex,
     SliderRow(211, "Track Fade Weight Duration", {1, 400}, {1, 200}, 100, Decimals(0), 0x100)},
    {kTrackFadeMinimumIndex,
     SliderRow(212, "Track Fade Weight Minimum", {1, 100}, {1, 10}, 5, Decimals(0), 0x100)},
    {kMaxFactorizationFramesIndex,
     SliderRow(214, "Max Factorization Frames", {1, 1000}, {1, 300}, 300, Decimals(0), 0x100)},
    {kMaxTransitionIterationsIndex,
     SliderRow(291, "Max Transition Iterations", {0, 50}, {1, 30}, 10, Decimals(0), 0x100)},
    {kFactorizationWindowOverlapIndex,
     SliderRow(216, "Factorization Window Overlap", {1, 100}, {1, 50}, 30, Decimals(0), 0x100)},
    {kTransitionWindowOverlapIndex,
     SliderRow(217, "Transition Window Overlap", {1, 100}, {1, 50}, 10, Decimals(0), 0x100)},
    {kTransitionBisquareSigmaIndex,
     SliderRow(HX_TRANSITION_BISQUARE_SIGMA, "Transition Bisquare Sigma", {1, 8}, Decimals(1),
               0x122, HX_PARAM_UI_DISABLED)},
    {kUseNewSolverIndex, CheckboxRow({292, 1}, "Use New Solver", 0x2)},
    {kTransitionMaxDurationIndex,
     SliderRow(287, "Transition Max Duration", {100, 500}, {100, 500}, 200, Decimals(0), 0x122)},
    {kTransitionStabLambdaIndex,
     SliderRow(288, "Transition Stab Lambda, 0=auto", {0, 300}, {10, 300}, 0, Decimals(1), 0x122)},
    {kTransitionFadeDurationIndex,
     SliderRow(289, "Transition TrackFadeWeight Dur.", {5, 100}, {5, 100}, 30, Decimals(0), 0x22)},
    {kConservativeFactorizationIndex,
     CheckboxRow({281, 1}, "Enable Conservative Factoriztn", 0x102)},
    {kConservativeThresholdIndex,
     SliderRow(293, "Consrv Fctrz Threshold,0=auto", {0, 100}, {0, 10}, 0, Decimals(1), 0x122)},
    {kHomographyLimitIndex, SliderRow(220, "Sanity-chck Homog. Limit,0=auto", {0, 10000}, {30, 90},
                                      0, Decimals(0), 0x100)},
    {kPathGaussianSigmaIndex,
     SliderRow(210, "Path Smooth Gaussian Sigma (30)", {0, 1000}, {0, 170}, 0, Decimals(1), 0x100)},
    {kPathBilateralSigmaIndex,
     SliderRow(218, "Path Smooth Bilateral Sigma", {0, 4000}, {0, 1000}, 0, Decimals(1), 0x100)},
    {82, GroupEndRow(250)},
    {kWarpFactorIndex, SliderRow(7, "Warp Factor", {0, 10}, {0, 10}, 10, Decimals(1), 0x122)},
    {kDeblurIndex, CheckboxRow({15, 0}, "Deblur", 0x100)},
    {kDeblurFrameRangeIndex,
     SliderRow(272, "Deblur Frame Range", {2, 99}, {2, 9}, 3, Decimals(0), 0x100)},
    {kDeblurFrameThresholdIndex,
     SliderRow(275, "Deblur Frame Threshold", {0, 100}, {0, 100}, 5, Decimals(0), 0x100)},
    {kDeblurComparisonBlurIndex,
     SliderRow(277, "Deblur Comparison Blur", {0, 100}, {0, 20}, 9, Decimals(1), 0x100)},
    {kDeblurPixelThresholdIndex,
     SliderRow(273, "Deblur Pixel Threshold", {0, 100}, {0, 100}, 3, kPercent, 0x100)},
    {kDeblurPixelSoftnessIndex,
     SliderRow(276, "Deblur Pixel Threshold Softness", {0, 100}, {0, 100}, 4, kPercent, 0x100)},
    {kShowDeblurMapIndex, CheckboxRow({274, 0}, "Show Deblur Map", 0x100)},
    {kDeblurDebugIndex, PopupRow({279, 1}, "Deblur Debug",
                                 "Off|Show Blurred Sharper Frame|Show Blurred This Frame|Show "
                                 "Sharper Frame|Show This Frame|Show Aligned Frame",
                                 0x102)},
    {kAlignedFrameIndex,
     SliderRow(278, "Aligned Frame to Show", {-50, 50}, {-10, 10}, 0, {0, 0x100}, 0)},
    {kSynthesisAlphaBoostIndex,
     SliderRow(283, "Synthesis Alpha Boost Factor", {1, 250}, {1, 10}, 5, {0, 0x100}, 0)},
    Shared(94, kKillTracksShorterThanParam),
    Shared(kShowTracksIndex, kShowTracksParam),
    Shared(96, kSaveTrackFileParam),
    {97, GroupEndRow(300)},
});

constexpr bool EachRowStandsAtItsIndex() {
  for (std::size_t i = 0; i < kTable.size(); ++i) {
    if (kTable[i].index != static_cast<std::int32_t>(i)) return false;
  }
  return kTable.size() == kParamCount;
}
static_assert(EachRowStandsAtItsIndex());

constexpr bool DiskIdsAreUnique() {
  std::array<std::int32_t, kParamCount> ids{};
  std::ranges::transform(kTable, ids.begin(), [](const TableRow& at) { return at.row.disk_id; });
  std::ranges::sort(ids);
  return std::ranges::adjacent_find(ids) == ids.end();
}
static_assert(DiskIdsAreUnique());

// What is declared without the experimental ones must stand alone.
constexpr bool GroupsClose() {
  int open = 0;
  for (const TableRow& at : kTable) {
    if (at.index == kFirstExperimentalIndex && open != 0) return false;
    if (at.row.kind == HX_PARAM_GROUP_START) ++open;
    if (at.row.kind == HX_PARAM_GROUP_END && --open < 0) return false;
  }
  return open == 0;
}
static_assert(GroupsClose());

constexpr bool SlidersTakeTheirDefaults() {
  return std::ranges::all_of(kTable, [](const TableRow& at) {
    const ParameterRow& row = at.row;
    const auto value = static_cast<float>(row.default_value);
    return row.kind != HX_PARAM_FLOAT_SLIDER ||
           (row.valid.min <= value && value <= row.valid.max && row.valid.min <= row.slider.min &&
            row.slider.min < row.slider.max);
  });
}
static_assert(SlidersTakeTheirDefaults());

// By AnalysisParam.
constexpr auto kIndexOfShared = [] {
  std::array<std::int32_t, kAnalysisRows.size()> indices{};
  for (const TableRow& at : kTable) {
    if (at.id != kNoParam) indices[static_cast<std::size_t>(at.id - kAnalyzeParam)] = at.index;
  }
  return indices;
}();
static_assert(std::ranges::find(kIndexOfShared, 0) == kIndexOfShared.end(),
              "each row of every analysing effect stands in the table");

}  // namespace

std::int32_t ParamIdToIndex(std::int32_t id) {
  if (id < kAnalyzeParam || id >= kAnalysisParamEnd) return kNoParam;
  return kIndexOfShared[static_cast<std::size_t>(id - kAnalyzeParam)];
}

std::int32_t IndexToParamId(std::int32_t index) {
  if (index < 0 || index >= kParamCount || index == kAnalysisStatusCounterIndex) return kNoParam;
  return kTable[static_cast<std::size_t>(index)].id;
}

const ParameterRow* ParameterTableRow(std::int32_t index) {
  if (index < 1 || index >= kParamCount) return nullptr;
  return &kTable[static_cast<std::size_t>(index)].row;
}

double GetParamDefault(std::int32_t id) {
  const ParameterRow* row = AnalysisParameterRow(id);
  if (!row) row = ParameterTableRow(id);
  return row ? row->default_value : 0.0;
}

}  // namespace kelp::effect
