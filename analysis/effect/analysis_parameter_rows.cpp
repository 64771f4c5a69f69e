#include "analysis/effect/analysis_parameter_rows.h"

#include <iterator>

namespace kelp::analysis::effect {

using kelp::effect::ButtonRow;
using kelp::effect::CheckboxRow;
using kelp::effect::Decimals;
using kelp::effect::ParameterRow;
using kelp::effect::SliderRow;

namespace {

// In the order of AnalysisParam. Disk ids are stored in projects: none may change or be used again.
constexpr ParameterRow kRows[] = {
    ButtonRow(1, "$$$/kelp/analysis/parameter/name/AnalyzeButton=Analyze", 0x140),
    ButtonRow(11, "$$$/kelp/analysis/parameter/name/CancelButton=Cancel", 0x140,
              HX_PARAM_UI_DISABLED),
    CheckboxRow(36, "$$$/kelp/analysis/parameter/name/DetailedAnalysis=Detailed Analysis", false,
                0x142),

    SliderRow(102, "Max Count, 0=auto", {0, 9999}, {100, 2000}, 0, Decimals(0), 0x40),
    CheckboxRow(110, "Presmoothing", true, 0x40),
    SliderRow(111, "Presmoothing Factor", {0.001f, 2}, {0.001f, 1}, 0.1, Decimals(2), 0x40),
    SliderRow(113, "Eigen Ratio Threshold", {0, 100}, {0, 100}, 15, Decimals(2), 0x40),
    SliderRow(104, "Selector X Radius, 0=auto", {0, 200}, {1, 50}, 0, Decimals(0), 0x40),
    SliderRow(105, "Selector Y Radius, 0=auto", {0, 200}, {1, 50}, 0, Decimals(0), 0x40),
    SliderRow(106, "Border Width to Avoid (pixels)", {1, 2000}, {1, 120}, 12, Decimals(0), 0x40),
    SliderRow(108, "min_eig", {1, 10000}, {1, 100}, 1, Decimals(1), 0x40),
    SliderRow(109, "max_eig", {1, 10000}, {4000, 10000}, 6000, Decimals(1), 0x40),
    SliderRow(107, "Threshold (screens out weak)", {0.001f, 1}, {0.01f, 1}, 0.01, Decimals(2),
              0x40),
    SliderRow(103, "Min Spacing (pixels), 0=auto", {0, 200}, {0, 50}, 0, Decimals(0), 0x40),

    SliderRow(123, "Pyramidal Levels", {1, 10}, {1, 10}, 5, Decimals(0), 0x40),
    SliderRow(124, "Tracker X Radius, 0=auto", {0, 50}, {1, 30}, 0, Decimals(0), 0x40),
    SliderRow(125, "Tracker Y Radius, 0=auto", {0, 50}, {1, 30}, 0, Decimals(0), 0x40),
    SliderRow(120, "Max Iterations", {1, 100}, {1, 30}, 25, Decimals(0), 0x40),
    SliderRow(121, "Tolerance Translation", {0, 10}, {0, 1}, 0.1, Decimals(2), 0x40),
    SliderRow(126, "Color Correction Trans (0,2)", {0, 2}, {0, 2}, 0, Decimals(0), 0x40),
    CheckboxRow(128, "Affine Verification", true, 0x40),
    SliderRow(122, "Tolerance Affine", {0, 10}, {0, 1}, 0.05, Decimals(2), 0x40),
    SliderRow(129, "Tolerance Color Lambda", {0, 10}, {0, 1}, 0.05, Decimals(2), 0x40),
    SliderRow(130, "Tolerance Color Delta", {0, 255}, {0, 10}, 1, Decimals(2), 0x40),
    SliderRow(127, "Color Correction Affine (0,2)", {0, 2}, {0, 2}, 2, Decimals(0), 0x40),
    SliderRow(131, "Tolerance Min Corr., 0=auto", {-1, 1}, {0, 1}, 0, Decimals(2), 0x40),
    SliderRow(133, "Tolerance Primary Color, 0=off", {0, 255}, {0, 64}, 5, Decimals(2), 0x40),
    SliderRow(295, "Prekill tracks shorter than:", {0, 200}, {0, 50}, 5, Decimals(0), 0x40),

    CheckboxRow(280, "Show Tracks", false, 0x100),
    ButtonRow(290, "Save TRK file", 0x140),
    SliderRow(302, "AnalysisStatusCounter", {0, 2e9f}, {0, 2000}, 0, Decimals(0), 0x102,
              HX_PARAM_UI_HIDDEN),
};
static_assert(std::size(kRows) == kAnalysisParamEnd - kAnalyzeParam);

}  // namespace

const ParameterRow* AnalysisParameterRow(std::int32_t id) {
  if (id < kAnalyzeParam || id >= kAnalysisParamEnd) return nullptr;
  return &kRows[id - kAnalyzeParam];
}

}  // namespace kelp::analysis::effect
