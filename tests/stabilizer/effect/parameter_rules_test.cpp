#include "stabilizer/effect/src/parameter_rules.h"

#include <gtest/gtest.h>

#include <sstream>
#include <string>

#include "analysis/effect/analysis_parameter_rules.h"
#include "analysis/src/param_fields.h"
#include "tests/support/parameter_values.h"

namespace kelp::effect {
namespace {

using namespace analysis::effect;

// Of a clip of 1920 x 1080 at 25 frames a second.
marrow::stabilization::SolverParamsRecord SolverParamsOf(const ParameterValues& values) {
  return GetSolverParams(values, {1920, 1080}, 25);
}

ParameterValues With(std::int32_t index, double value) {
  ParameterValues values;
  values[index] = value;
  return values;
}

// "name value, " of each field.
template <class Params>
std::string FieldsOf(const Params& params) {
  std::ostringstream fields;
  analysis::ForEachField(params, [&fields](const char* name, const auto& value) {
    fields << name << ' ' << value << ", ";
  });
  return fields.str();
}

TEST(ParameterRulesTest, SpacingKeepsFiveTimesTheSlotsApart) {
  const ParameterValues normal, detailed = With(kDetailedAnalysisIndex, 1);
  const struct {
    std::uint32_t width, height;
    std::uint64_t normal, detailed;
  } cases[] = {{640, 480, 11, 6},    {720, 576, 13, 6}, {1280, 720, 19, 10}, {1920, 1080, 29, 14},
               {3840, 2160, 58, 29}, {320, 240, 6, 4},  {64, 64, 4, 4}};
  for (const auto& c : cases) {
    EXPECT_EQ(GetSelectorParams(normal, c.width, c.height).spacing, c.normal) << c.width;
    EXPECT_EQ(GetSelectorParams(detailed, c.width, c.height).spacing, c.detailed) << c.width;
  }
  EXPECT_EQ(GetSelectorParams(normal, 1920, 1080).max_count, 500u);
  EXPECT_EQ(GetSelectorParams(detailed, 1920, 1080).max_count, 2000u);
  EXPECT_EQ(GetTrackerParams(normal, 1080).tolerance_min_correlation, 0.7);
  EXPECT_EQ(GetTrackerParams(detailed, 1080).tolerance_min_correlation, 0.5);
}

TEST(ParameterRulesTest, WindowsGrowWithTheHeight) {
  constexpr std::pair<std::uint32_t, std::uint32_t> cases[] = {{300, 7},   {554, 7},   {555, 8},
                                                               {600, 8},   {630, 9},   {720, 10},
                                                               {1079, 14}, {1080, 15}, {2000, 15}};
  for (const auto& [height, half] : cases) {
    EXPECT_EQ(WindowRule(height, false), half) << height;
    EXPECT_EQ(WindowRule(height, true), half + 5) << height;
  }
}

// Rate 25: sigmas of the crop path over the range of its control.
TEST(ParameterRulesTest, CropLessSmoothMoreSetsThePathSigmas) {
  const struct {
    double percent;
    float bilateral, gaussian;
  } cases[] = {{0, 1, 50},      {25, 480, 50},   {50, 1920, 50},
               {75, 1920, 275}, {99, 1920, 491}, {100, 1920, 1000000}};
  for (const auto& c : cases) {
    const auto params = SolverParamsOf(With(kCropLessSmoothMoreIndex, c.percent));
    EXPECT_NEAR(params.path_bilateral_sigma, c.bilateral, 1e-3) << c.percent;
    EXPECT_NEAR(params.path_gaussian_sigma, c.gaussian, 1e-3) << c.percent;
  }
}

// What SolveHashTest does not see.
TEST(ParameterRulesTest, AnamorphicClipsAreSolvedInSquarePixels) {
  const auto params = GetSolverParams(ParameterValues(), {720, 576, 64, 45}, 25);
  EXPECT_EQ(params.pixel_aspect, 1024.0f / 720.0f);
  EXPECT_NEAR(params.reconstruction_error_threshold, 0.0045 * 1024, 1e-9);
  EXPECT_NEAR(SolverParamsOf(ParameterValues()).reconstruction_error_threshold, 8.64, 1e-9);
}

// Every parameter of the trackers gets a number of its own, so that a field that reads another's
// shows. Those of a solve: SolveHashTest.
TEST(ParameterRulesTest, ShownTrackerParametersReachTheirFields) {
  ParameterValues values;
  for (std::int32_t index = 33; index <= 56; ++index) values[index] = 100 + index;
  values[34] = values[50] = 0;
  values[94] = 194;
  EXPECT_EQ(FieldsOf(GetSelectorParams(values, 1920, 1080)),
            "max_count 133, spacing 143, half_winx 137, half_winy 138, border 139, threshold 142, "
            "min_eig 140, max_eig 141, presmoothing 0, presmooth_factor 135, "
            "eig_ratio_threshold 136, ");
  EXPECT_EQ(FieldsOf(GetTrackerParams(values, 1080)),
            "max_iterations 147, tolerance_translation 148, tolerance_affine 151, "
            "pyramidal_levels 144, half_win_x 145, half_win_y 146, "
            "color_correction_translation 149, color_correction_affine 154, "
            "affine_verification 0, tolerance_color_lambda 152, tolerance_color_delta 153, "
            "tolerance_min_correlation 155, tolerance_primary_color_threshold 156, "
            "kill_tracks_shorter_than 194, ");
}

// What an automatic value is found from may itself be set.
TEST(ParameterRulesTest, SetCountsGiveTheSpacingAndNegativeOnesTheAutomaticValue) {
  ParameterValues values;
  values[33] = 8;
  values[37] = values[45] = 3;
  auto selector = GetSelectorParams(values, 320, 240);
  EXPECT_EQ(selector.spacing, 44u);  // sqrt(320 * 240 / 40) = 43.8
  EXPECT_EQ(selector.half_winx, 3u);
  EXPECT_EQ(selector.half_winy, 7u);
  EXPECT_EQ(GetTrackerParams(values, 240).half_win_x, 3u);
  EXPECT_EQ(GetTrackerParams(values, 240).half_win_y, 7u);
  values[33] = values[37] = -50;
  selector = GetSelectorParams(values, 320, 240);
  EXPECT_EQ(selector.max_count, 500u);
  EXPECT_EQ(selector.half_winx, 7u);
}

}  // namespace
}  // namespace kelp::effect
