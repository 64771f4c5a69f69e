#include "stabilizer/effect/src/parameter_table.h"

#include <algorithm>
#include <iterator>

#include "analysis/effect/analysis_parameter_rows.h"
#include "stabilizer/effect/src/stabilizer_strings.h"

namespace kelp::effect {

using analysis::effect::AnalysisParameterRow;

namespace {

// Runs of ids at runs of indices.
constexpr struct {
  std::int32_t first_id, first_index, count;
  bool reversible = true;
} kIdRuns[] = {
    {analysis::effect::kAnalyzeParam, kAnalyzeIndex, 2},
    {analysis::effect::kDetailedAnalysisParam, kDetailedAnalysisIndex, 1},
    {analysis::effect::kMaxCountParam, 33, 24},
    {analysis::effect::kKillTracksShorterThanParam, 94, 3},
    {analysis::effect::kAnalysisStatusCounterParam, kAnalysisStatusCounterIndex, 1, false},
};

// The rows between those of every analysing effect. Disk ids are stored in projects: none may
// change or be used again.
constexpr ParameterRow kRowsFrom3[] = {
    GroupStartRow(12, kStringStabilization),
    PopupRow(19, kStringResult, kStringResultItems, 1, 0x102),
    SliderRow(20, kStringSmoothness, {0, 1000}, {0, 100}, 50, kPercent, 0x122),
    PopupRow(28, kStringMethod, kStringMethodItems, 4, 0x102),
    GroupEndRow(13),
    GroupStartRow(8, kStringBorders),
    PopupRow(22, kStringFraming, kStringFramingItems, 3, 0x102),
    GroupStartRow(17, kStringAutoScale, HX_PARAM_FLAG_CLOSED),
    SliderRow(4, kStringMaximumScale, {100, 10000}, {100, 200}, 150, kPercent, 0x122),
    SliderRow(3, kStringActionSafeMargin, {0, 100}, {0, 20}, 0, kPercent, 0x122),
    GroupEndRow(18),
    SliderRow(16, kStringAdditionalScale, {0, 10000}, {0, 200}, 100, kPercent, 0x100),
    GroupEndRow(9),
    GroupStartRow(24, kStringAdvanced, HX_PARAM_FLAG_CLOSED),
};

constexpr ParameterRow kRowsFrom18[] = {
    PopupRow(37, kStringRollingShutterRipple, kStringRollingShutterRippleItems, 1, 0x102),
    SliderRow(23, kStringCropLessSmoothMore, {0, 100}, {0, 100}, 50, kPercent, 0x122),
    SliderRow(38, kStringSynthesisInputRange, {0, 999}, {0.01f, 5}, 0.5, Decimals(2), 0x122),
    SliderRow(35, kStringSynthesisEdgeFeather, {0, 999}, {0, 20}, 10, Decimals(0), 0x120),
    GroupStartRow(29, kStringSynthesisEdgeCropping, HX_PARAM_FLAG_CLOSED),
    SliderRow(31, kStringLeft, {0, 999}, {0, 20}, 0, Decimals(0), 0x120),
    SliderRow(32, kStringTop, {0, 999}, {0, 20}, 0, Decimals(0), 0x120),
    SliderRow(33, kStringRight, {0, 999}, {0, 20}, 0, Decimals(0), 0x120),
    SliderRow(34, kStringBottom, {0, 999}, {0, 20}, 0, Decimals(0), 0x120),
    GroupEndRow(30),
    CheckboxRow(26, kStringHideWarningBanner, false, 0x102),
    GroupEndRow(25),
};

constexpr ParameterRow kRowsFrom31[] = {
    GroupStartRow(100, "Experimental", HX_PARAM_FLAG_CLOSED),
    GroupStartRow(101, "Trackers", HX_PARAM_FLAG_CLOSED),
};

constexpr ParameterRow kRowsFrom57[] = {
    GroupEndRow(200),
    GroupStartRow(201, "Stabilization", HX_PARAM_FLAG_CLOSED),
    SliderRow(203, "Rank", {1, 50}, {1, 100}, 9, Decimals(0), 0x100),
    SliderRow(204, "Window Duration", {1, 500}, {1, 100}, 40, Decimals(0), 0x100),
    SliderRow(205, "Window Step", {1, 100}, {1, 5}, 5, Decimals(0), 0x100),
    SliderRow(206, "Ignore Trackers Shorter Than", {1, 200}, {1, 50}, 5, Decimals(0), 0x100),
    SliderRow(207, "Kernel Size", {1, 400}, {1, 200}, 100, Decimals(0), 0x100,
              HX_PARAM_UI_DISABLED),
    SliderRow(208, "Short Trajectory Duration", {1, 200}, {1, 100}, 10, Decimals(0), 0x100,
              HX_PARAM_UI_DISABLED),
    SliderRow(209, "Max Reprojection Error", {0, 1}, {0, 0.1f}, 0.0045, Decimals(4), 0x100),
    SliderRow(211, "Track Fade Weight Duration", {1, 400}, {1, 200}, 100, Decimals(0), 0x100),
    SliderRow(212, "Track Fade Weight Minimum", {1, 100}, {1, 10}, 5, Decimals(0), 0x100),
    SliderRow(214, "Max Factorization Frames", {1, 1000}, {1, 300}, 300, Decimals(0), 0x100),
    SliderRow(291, "Max Transition Iterations", {0, 50}, {1, 30}, 10, Decimals(0), 0x100),
    SliderRow(216, "Factorization Window Overlap", {1, 100}, {1, 50}, 30, Decimals(0), 0x100),
    SliderRow(217, "Transition Window Overlap", {1, 100}, {1, 50}, 10, Decimals(0), 0x100),
    SliderRow(285, "Transition Bisquare Sigma", {1, 10}, {1, 8}, 5, Decimals(1), 0x122,
              HX_PARAM_UI_DISABLED),
    CheckboxRow(292, "Use New Solver", true, 0x2),
    SliderRow(287, "Transition Max Duration", {100, 500}, {100, 500}, 200, Decimals(0), 0x122),
    SliderRow(288, "Transition Stab Lambda, 0=auto", {0, 300}, {10, 300}, 0, Decimals(1), 0x122),
    SliderRow(289, "Transition TrackFadeWeight Dur.", {5, 100}, {5, 100}, 30, Decimals(0), 0x22),
    CheckboxRow(281, "Enable Conservative Factoriztn", true, 0x102),
    SliderRow(293, "Consrv Fctrz Threshold,0=auto", {0, 100}, {0, 10}, 0, Decimals(1), 0x122),
    SliderRow(220, "Sanity-chck Homog. Limit,0=auto", {0, 10000}, {30, 90}, 0, Decimals(0), 0x100),
    SliderRow(210, "Path Smooth Gaussian Sigma (30)", {0, 1000}, {0, 170}, 0, Decimals(1), 0x100),
    SliderRow(218, "Path Smooth Bilateral Sigma", {0, 4000}, {0, 1000}, 0, Decimals(1), 0x100),
    GroupEndRow(250),
    SliderRow(7, "Warp Factor", {0, 10}, {0, 10}, 10, Decimals(1), 0x122),
    CheckboxRow(15, "Deblur", false, 0x100),
    SliderRow(272, "Deblur Frame Range", {2, 99}, {2, 9}, 3, Decimals(0), 0x100),
    SliderRow(275, "Deblur Frame Threshold", {0, 100}, {0, 100}, 5, Decimals(0), 0x100),
    SliderRow(277, "Deblur Comparison Blur", {0, 100}, {0, 20}, 9, Decimals(1), 0x100),
    SliderRow(273, "Deblur Pixel Threshold", {0, 100}, {0, 100}, 3, kPercent, 0x100),
    SliderRow(276, "Deblur Pixel Threshold Softness", {0, 100}, {0, 100}, 4, kPercent, 0x100),
    CheckboxRow(274, "Show Deblur Map", false, 0x100),
    PopupRow(279, "Deblur Debug",
             "Off|Show Blurred Sharper Frame|Show Blurred This Frame|Show Sharper Frame|Show This "
             "Frame|Show Aligned Frame",
             1, 0x102),
    SliderRow(278, "Aligned Frame to Show", {-50, 50}, {-10, 10}, 0, {0, 0x100}, 0),
    SliderRow(283, "Synthesis Alpha Boost Factor", {1, 250}, {1, 10}, 5, {0, 0x100}, 0),
};

constexpr ParameterRow kRowsFrom97[] = {GroupEndRow(300)};

constexpr struct {
  std::int32_t first_index, count;
  const ParameterRow* rows;
} kRowRuns[] = {
    {3, std::size(kRowsFrom3), kRowsFrom3},    {18, std::size(kRowsFrom18), kRowsFrom18},
    {31, std::size(kRowsFrom31), kRowsFrom31}, {57, std::size(kRowsFrom57), kRowsFrom57},
    {97, std::size(kRowsFrom97), kRowsFrom97},
};

}  // namespace

std::int32_t ParamIdToIndex(std::int32_t id) {
  for (const auto& run : kIdRuns) {
    if (id >= run.first_id && id < run.first_id + run.count) {
      return run.first_index + (id - run.first_id);
    }
  }
  return kNoParam;
}

std::int32_t IndexToParamId(std::int32_t index) {
  for (const auto& run : kIdRuns) {
    if (run.reversible && index >= run.first_index && index < run.first_index + run.count) {
      return run.first_id + (index - run.first_index);
    }
  }
  return kNoParam;
}

const ParameterRow* ParameterTableRow(std::int32_t index) {
  if (index == kAnalysisStatusCounterIndex) {
    return AnalysisParameterRow(analysis::effect::kAnalysisStatusCounterParam);
  }
  if (const ParameterRow* row = AnalysisParameterRow(IndexToParamId(index))) return row;
  for (const auto& run : kRowRuns) {
    if (index >= run.first_index && index < run.first_index + run.count) {
      return &run.rows[index - run.first_index];
    }
  }
  return nullptr;
}

double GetParamDefault(std::int32_t id) {
  const ParameterRow* row = AnalysisParameterRow(id);
  if (!row) row = ParameterTableRow(id);
  return row ? row->default_value : 0.0;
}

}  // namespace kelp::effect
