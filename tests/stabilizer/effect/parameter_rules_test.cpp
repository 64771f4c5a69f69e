#include "stabilizer/effect/src/parameter_rules.h"

#include <gtest/gtest.h>

#include "analysis/effect/analysis_parameter_rows.h"
#include "analysis/effect/analysis_parameter_rules.h"

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
  } cases[] = {{640, 480, 11, 6},    {720, 576, 13, 6}, {1280, 720, 19, 10}, {1920, 1080, 29, 14},
               {3840, 2160, 58, 29}, {320, 240, 6, 4},  {64, 64, 4, 4}};
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
  const struct {
    std::uint32_t width;
    std::int64_t num, den;
    std::uint32_t square;
  } cases[] = {{1440, 4, 3, 1920}, {720, 16, 15, 768}, {720, 10, 11, 655},
               {720, 0, 1, 1},     {720, 0, 0, 1},     {720, 1, 0, UINT32_MAX}};
  for (const auto& c : cases) {
    clip.width = c.width;
    clip.pixel_aspect_num = c.num;
    clip.pixel_aspect_den = c.den;
    EXPECT_EQ(clip.square_width(), c.square) << c.num << ':' << c.den;
  }
}

TEST(ParameterRulesTest, ControlsStartAtTheTablesDefaults) {
  const ParameterValues controls = ValuesOf({});
  for (std::int32_t index = 0; index < kParamCount; ++index) {
    EXPECT_EQ(controls.Value(index), GetParamDefault(index)) << index;
  }
}

// Every parameter of the trackers gets a number of its own, so that a field that reads another's
// shows.
TEST(ParameterRulesTest, ShownTrackerParametersReachTheirFields) {
  using namespace analysis::effect;
  const auto number = [](std::int32_t id) { return id + 12000; };
  ParameterValues values;
  for (std::int32_t id = kMaxCountParam; id <= kKillTracksShorterThanParam; ++id) {
    values[ParamIdToIndex(id)] = number(id);
  }
  values[ParamIdToIndex(kPresmoothingParam)] = 0;
  values[ParamIdToIndex(kAffineVerificationParam)] = 0;

  const auto selector = GetSelectorParams(TableReader(values, true), 1920, 1080);
  EXPECT_EQ(selector.max_count, number(-9997));
  EXPECT_EQ(selector.spacing, number(-9987));
  EXPECT_EQ(selector.half_winx, number(-9993));
  EXPECT_EQ(selector.half_winy, number(-9992));
  EXPECT_EQ(selector.border, number(-9991));
  EXPECT_EQ(selector.threshold, number(-9988));
  EXPECT_EQ(selector.min_eig, number(-9990));
  EXPECT_EQ(selector.max_eig, number(-9989));
  EXPECT_FALSE(selector.presmoothing);
  EXPECT_EQ(selector.presmooth_factor, number(-9995));
  EXPECT_EQ(selector.eig_ratio_threshold, number(-9994));

  const auto tracker = GetTrackerParams(TableReader(values, true), 1080);
  EXPECT_EQ(tracker.max_iterations, number(-9983));
  EXPECT_EQ(tracker.tolerance_translation, number(-9982));
  EXPECT_EQ(tracker.tolerance_affine, number(-9979));
  EXPECT_EQ(tracker.pyramidal_levels, number(-9986));
  EXPECT_EQ(tracker.half_win_x, number(-9985));
  EXPECT_EQ(tracker.half_win_y, number(-9984));
  EXPECT_EQ(tracker.color_correction_translation, number(-9981));
  EXPECT_EQ(tracker.color_correction_affine, number(-9976));
  EXPECT_FALSE(tracker.affine_verification);
  EXPECT_EQ(tracker.tolerance_color_lambda, number(-9978));
  EXPECT_EQ(tracker.tolerance_color_delta, number(-9977));
  EXPECT_EQ(tracker.tolerance_min_correlation, number(-9975));
  EXPECT_EQ(tracker.tolerance_primary_color_threshold, number(-9974));
  EXPECT_EQ(tracker.kill_tracks_shorter_than, number(-9973));
}

TEST(ParameterRulesTest, ShownSolveParametersReachTheirFields) {
  ParameterValues values;
  for (std::int32_t index = 59; index <= 83; ++index) values[index] = 100 + index;
  values[73] = values[77] = 0;
  const auto record = GetSolverParams(TableReader(values, true), Clip(1920, 1080));
  EXPECT_EQ(record.rank, 159);
  EXPECT_EQ(record.duration, 160);
  EXPECT_EQ(record.step, 161);
  EXPECT_EQ(record.min_duration, 162);
  EXPECT_EQ(record.kernel_size, 163);
  EXPECT_EQ(record.short_trajectory_duration, 164);
  EXPECT_EQ(record._reconstruction_error_threshold_ratio, 165);
  EXPECT_EQ(record.reconstruction_error_threshold, 165 * 1920);
  EXPECT_EQ(record.reconstruction_error_third, 165 * 640);
  EXPECT_EQ(record.track_fade_duration, 166);
  EXPECT_EQ(record.track_fade_minimum, 167);
  EXPECT_EQ(record.max_factorization_frames, 168);
  EXPECT_EQ(record.max_transition_iterations, 169);
  EXPECT_EQ(record.factorization_window_overlap, 170);
  EXPECT_EQ(record.transition_window_overlap, 171);
  EXPECT_EQ(record.transition_bisquare_sigma, 172);
  EXPECT_FALSE(record.use_new_solver);
  EXPECT_EQ(record.transition_max_duration, 174);
  EXPECT_EQ(record.transition_stab_lambda, 175);
  EXPECT_EQ(record.transition_fade_duration, 176);
  EXPECT_FALSE(record.conservative_factorization);
  EXPECT_EQ(record.conservative_threshold, 178);
  EXPECT_EQ(record.homography_limit, 179);
  EXPECT_EQ(record.path_gaussian_sigma, 180);
  EXPECT_EQ(record.path_bilateral_sigma, 181);
  EXPECT_NEAR(record.method_level, 4 - (1 - 18.3), 1e-5);
}

// What an automatic value is found from may itself be set.
TEST(ParameterRulesTest, SetCountsGiveTheSpacingAndNegativeOnesTheAutomaticValue) {
  ParameterValues values;
  values[33] = 8;
  values[37] = values[45] = 3;
  const TableReader reader(values, true);
  auto selector = analysis::effect::GetSelectorParams(reader, 320, 240);
  EXPECT_EQ(selector.spacing, 44u);  // sqrt(320 * 240 / 40) = 43.8
  EXPECT_EQ(selector.half_winx, 3u);
  EXPECT_EQ(selector.half_winy, 7u);
  EXPECT_EQ(analysis::effect::GetTrackerParams(reader, 240).half_win_x, 3u);
  EXPECT_EQ(analysis::effect::GetTrackerParams(reader, 240).half_win_y, 7u);
  values[33] = values[37] = -50;
  selector = analysis::effect::GetSelectorParams(reader, 320, 240);
  EXPECT_EQ(selector.max_count, 500u);
  EXPECT_EQ(selector.half_winx, 7u);
}

}  // namespace
}  // namespace kelp::effect
