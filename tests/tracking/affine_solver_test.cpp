#include "tracking/affine_solver.h"

#include <gtest/gtest.h>

#include <cmath>
#include <vector>

#include "tests/tracking/tracker_images.h"
#include "tracking/correlation.h"

namespace marrow::tracking {
namespace {

using testing::kNaN;
using testing::Level0;
using testing::Pattern;
using testing::Picture;
using testing::PlainStep;
using testing::Template;

constexpr solver_tolerances kTolerances{0.1f, 0.05f, 0.05f, 1.0f};
constexpr float kX = 40.25f, kY = 36.5f;

ImagePyramid Base() {
  return Picture(96, 80, 3, 1, Pattern);
}

// 0.9 times the base plus 10, under [[1.03, 0.02], [-0.015, 0.98]] about (kX, kY) and a shift of
// (0.8, -0.5).
ImagePyramid Warped() {
  return Picture(96, 80, 3, 1, [](double x, double y, double c) {
    const double u = x - kX - 0.8, v = y - kY + 0.5;
    const double determinant = 1.03 * 0.98 + 0.02 * 0.015;
    return 0.9 * Pattern(kX + (0.98 * u - 0.02 * v) / determinant,
                         kY + (0.015 * u + 1.03 * v) / determinant, c) +
           10;
  });
}

struct Result {
  int iterations;
  AffineState state;
};

Result Solve(Template& t, const ImagePyramid& image, color_mode mode, int max_iterations = 25,
             AffineState start = {kX, kY}) {
  packed_cholesky normal;
  if (!PrepareAffine(t.plane(), t.shape(), mode == color_mode::joint, normal)) {
    return {-2, start};
  }
  const int k = SolveAffine(t.plane(), t.shape(), normal, Level0(image), mode, kTolerances,
                            max_iterations, start, t.window());
  return {k, start};
}

TEST(AffineSolverTest, AffineMotionWithGainAndBias) {
  const ImagePyramid base = Base(), warped = Warped();
  Template t(base, 7, kX, kY);
  const auto [iterations, state] = Solve(t, warped, color_mode::joint);
  EXPECT_EQ(iterations, 2);
  EXPECT_NEAR(state.dx, 0.7957, 1e-4);
  EXPECT_NEAR(state.dy, -0.5026, 1e-4);
  EXPECT_NEAR(state.a, 0.0285, 1e-4);
  EXPECT_NEAR(state.b, 0.0191, 1e-4);
  EXPECT_NEAR(state.c, -0.0150, 1e-4);
  EXPECT_NEAR(state.d, -0.0222, 1e-4);
  EXPECT_NEAR(state.gain[0], 1.1111, 1e-3);
  EXPECT_NEAR(state.bias[0], -11.28, 2e-2);
  EXPECT_GT(NormalisedCorrelation(t.shape(), t.plane(), t.window()), 0.9999f);
  EXPECT_EQ(Solve(t, warped, color_mode::joint, 2).iterations, 2) << "the limit, not convergence";
}

TEST(AffineSolverTest, UpdatesCompose) {
  AffineState state(kX, kY);
  state.a = 0.02f, state.b = 0.01f, state.c = -0.02f, state.d = -0.03f;
  const double step[] = {0.3, -0.2, 0.01, -0.02, 0.03, 0.005};
  ComposeAffine(step, state);
  EXPECT_NEAR(1 + state.a, 1.02998022, 2e-7);
  EXPECT_NEAR(state.b, -0.01065287, 2e-7);
  EXPECT_NEAR(state.c, 0.00933394, 2e-7);
  EXPECT_NEAR(1 + state.d, 0.97468675, 2e-7);
  EXPECT_NEAR(state.dx, 0.31112464, 2e-7);
  EXPECT_NEAR(state.dy, -0.19213717, 2e-7);
}

// One iteration from a start that is off in everything.
TEST(AffineSolverTest, AStepIsTheLeastSquaresStep) {
  const ImagePyramid base = Base(), warped = Warped();
  Template t(base, 7, kX, kY);
  AffineState start(kX, kY);
  start.dx = 0.4f, start.b = 0.03f, start.d = -0.05f;
  start.gain[1] = 1.05f, start.bias[2] = -3.0f;
  for (const bool color : {false, true}) {
    AffineState expected = start;
    const Result result = Solve(t, warped, color ? color_mode::joint : color_mode::none, 1, start);
    const std::vector<double> step = PlainStep(t, start, 6, color);
    ComposeAffine(step.data(), expected);
    EXPECT_NEAR(result.state.dx, expected.dx, 1e-4) << color;
    EXPECT_NEAR(result.state.dy, expected.dy, 1e-4) << color;
    EXPECT_NEAR(result.state.a, expected.a, 1e-5) << color;
    EXPECT_NEAR(result.state.b, expected.b, 1e-5) << color;
    EXPECT_NEAR(result.state.c, expected.c, 1e-5) << color;
    EXPECT_NEAR(result.state.d, expected.d, 1e-5) << color;
    for (int c = 0; c < 3; ++c) {
      const double e = color ? std::exp(step[6 + 2 * c]) : 1.0;
      const double moved = start.bias[c] + (color ? step[7 + 2 * c] : 0.0);
      EXPECT_NEAR(result.state.gain[c], start.gain[c] * e, 1e-4) << c;
      EXPECT_NEAR(result.state.bias[c], moved * e, 2e-2) << c;
    }
  }
}

TEST(AffineSolverTest, OtherColourModesFail) {
  const ImagePyramid base = Base();
  Template t(base, 7, kX, kY);
  for (const int mode : {1, 3, 4, -1}) {
    EXPECT_EQ(Solve(t, base, static_cast<color_mode>(mode)).iterations, kLevelFailed) << mode;
  }
  EXPECT_EQ(Solve(t, base, color_mode::none).iterations, 0);
}

TEST(AffineSolverTest, ACornerOnOrBehindTheImagesEdgeFails) {
  const ImagePyramid base = Base();  // 96 x 80
  Template t(base, 7, kX, kY);
  const auto fails = [&](AffineState state) {
    return Solve(t, base, color_mode::none, 1, state).iterations == kLevelFailed;
  };
  EXPECT_TRUE(fails({7, 40}));
  EXPECT_FALSE(fails({7.01f, 40}));
  EXPECT_TRUE(fails({88, 40}));
  EXPECT_FALSE(fails({87.99f, 40}));
  EXPECT_TRUE(fails({40, 7}));
  EXPECT_FALSE(fails({40, 7.01f}));
  EXPECT_TRUE(fails({40, 72}));
  EXPECT_FALSE(fails({40, 71.99f}));
  AffineState wide(40, 12);
  EXPECT_FALSE(fails(wide));
  wide.d = 0.8f;
  EXPECT_TRUE(fails(wide));
  for (float AffineState::*field : {&AffineState::dx, &AffineState::dy, &AffineState::a,
                                    &AffineState::b, &AffineState::c, &AffineState::d}) {
    for (const float bad : {kNaN, INFINITY, 1e30f, -1e30f}) {
      AffineState broken(40, 40);
      broken.*field = bad;
      EXPECT_TRUE(fails(broken)) << bad;
    }
  }
}

TEST(AffineSolverTest, WindowsThatDoNotTellTheMotionAreSingular) {
  const auto singular = [](auto value, bool color) {
    const ImagePyramid image = Picture(96, 80, 3, 1, value);
    Template t(image, 7, kX, kY);
    packed_cholesky normal;
    return !PrepareAffine(t.plane(), t.shape(), color, normal);
  };
  for (const bool color : {false, true}) {
    EXPECT_TRUE(singular([](double, double, double) { return 77.0; }, color));
    EXPECT_TRUE(singular([](double x, double, double) { return 100 + 50 * std::sin(x); }, color))
        << "stripes tell nothing of y";
    EXPECT_FALSE(singular(Pattern, color));
  }
  // One flat channel has no gain apart from its bias, but motion enough.
  const auto half_flat = [](double x, double y, double c) {
    return c == 1 ? 80 : Pattern(x, y, c);
  };
  EXPECT_TRUE(singular(half_flat, true));
  EXPECT_FALSE(singular(half_flat, false));
  // Values that are no numbers are no matrix.
  packed_cholesky normal;
  const double nan = kNaN;
  EXPECT_FALSE(normal.Factor(&nan, 1));
}

}  // namespace
}  // namespace marrow::tracking
