#include "stabilizer/effect/src/parameter_rules.h"

#include <gtest/gtest.h>

#include "stabilizer/effect/src/analysis_parameter_rules.h"

namespace kelp::effect {
namespace {

ClipGeometry Clip(std::uint32_t width, std::uint32_t height) {
  ClipGeometry clip;
  clip.width = width;
  clip.height = height;
  return clip;
}

Controls Detailed() {
  Controls controls;
  controls.detailed_analysis = true;
  return controls;
}

TEST(ParameterRulesTest, SpacingKeepsFiveTimesTheSlotsApart) {
  const struct {
    std::uint32_t width, height;
    std::uint64_t normal, detailed;
  } cases[] = {{640, 480, 11, 6},    {720, 576, 13, 6},    {1280, 720, 19, 10},
               {1920, 1080, 29, 14}, {3840, 2160, 58, 29}, {64, 64, 4, 4}};
  for (const auto& c : cases) {
    EXPECT_EQ(MakeSelectorParams({}, Clip(c.width, c.height)).spacing, c.normal) << c.width;
    EXPECT_EQ(MakeSelectorParams(Detailed(), Clip(c.width, c.height)).spacing, c.detailed)
        << c.width;
  }
}

TEST(ParameterRulesTest, WindowsGrowWithTheHeight) {
  const struct {
    std::uint32_t height;
    std::uint64_t half;
  } cases[] = {{300, 7}, {480, 7},  {554, 7},   {555, 8},   {576, 8},  {600, 8},
               {630, 9}, {720, 10}, {1079, 14}, {1080, 15}, {2000, 15}};
  for (const auto& c : cases) {
    EXPECT_EQ(analysis::effect::WindowRule(c.height, false), c.half) << c.height;
    EXPECT_EQ(analysis::effect::WindowRule(c.height, true), c.half + 5) << c.height;
  }
}

TEST(ParameterRulesTest, DetailedAnalysisTakesMoreFeaturesAndToleratesMore) {
  EXPECT_EQ(MakeSelectorParams({}, Clip(1920, 1080)).max_count, 500u);
  EXPECT_EQ(MakeSelectorParams(Detailed(), Clip(1920, 1080)).max_count, 2000u);
  EXPECT_EQ(MakeTrackerParams({}, Clip(1920, 1080)).tolerance_min_correlation, 0.7);
  EXPECT_EQ(MakeTrackerParams(Detailed(), Clip(1920, 1080)).tolerance_min_correlation, 0.5);
}

// Rate 25: sigmas of the crop path over the range of its control.
TEST(ParameterRulesTest, CropLessSmoothMoreSetsThePathSigmas) {
  const struct {
    double percent;
    float bilateral, gaussian;
  } cases[] = {{0, 1, 50},      {25, 480, 50},   {50, 1920, 50},
               {75, 1920, 275}, {99, 1920, 491}, {100, 1920, 1000000}};
  for (const auto& c : cases) {
    Controls controls;
    controls.crop_less_smooth_more = c.percent;
    const auto params = MakeSolverParams(controls, Clip(1920, 1080));
    EXPECT_NEAR(params.path_bilateral_sigma, c.bilateral, 1e-3) << c.percent;
    EXPECT_NEAR(params.path_gaussian_sigma, c.gaussian, 1e-3) << c.percent;
  }
}

TEST(ParameterRulesTest, EnhancedRippleReductionAndFramingSetTheirLimits) {
  Controls controls;
  auto params = MakeSolverParams(controls, Clip(1920, 1080));
  EXPECT_EQ(params.conservative_threshold, 7.5);
  EXPECT_EQ(params.homography_limit, 50.0f);
  EXPECT_EQ(params.maximum_scale, 1.5f);
  EXPECT_TRUE(params.crop);
  EXPECT_NEAR(params.reconstruction_error_threshold, 8.64, 1e-9);

  controls.rolling_shutter_ripple = RollingShutterRipple::enhanced_reduction;
  controls.framing = Framing::stabilize_only;
  controls.smoothness = 10;
  params = MakeSolverParams(controls, Clip(1920, 1080));
  EXPECT_EQ(params.conservative_threshold, 2.5);
  EXPECT_EQ(params.homography_limit, 100.0f);
  EXPECT_EQ(params.maximum_scale, 1.0f);
  EXPECT_FALSE(params.crop);
  EXPECT_EQ(params.smoothness_lambda, 40.0);
  EXPECT_EQ(params.transition_stab_lambda, 20.0);
}

TEST(ParameterRulesTest, AnamorphicClipsAreSolvedInSquarePixels) {
  ClipGeometry clip = Clip(720, 576);
  clip.pixel_aspect_num = 64;
  clip.pixel_aspect_den = 45;
  EXPECT_EQ(clip.square_width(), 1024u);
  EXPECT_EQ(clip.pixel_aspect(), 1024.0f / 720.0f);
  EXPECT_NEAR(MakeSolverParams({}, clip).reconstruction_error_threshold, 0.0045 * 1024, 1e-9);
  clip.pixel_aspect_num = 1;
  clip.pixel_aspect_den = 10000;
  EXPECT_EQ(clip.square_width(), 1u);
}

}  // namespace
}  // namespace kelp::effect
