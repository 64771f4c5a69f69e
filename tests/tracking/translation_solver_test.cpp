#include "tracking/translation_solver.h"

#include <gtest/gtest.h>

#include <cmath>
#include <vector>

#include "tests/tracking/tracker_images.h"

namespace marrow::tracking {
namespace {

using testing::kNaN;
using testing::Level0;
using testing::Pattern;
using testing::Picture;
using testing::PlainStep;
using testing::Sample;
using testing::Template;

constexpr solver_tolerances kTolerances{0.1f, 0.05f, 0.05f, 1.0f};
// The regressed fit and the motion take turns: small steps that are far from the end.
constexpr solver_tolerances kFine{0.001f, 0.05f, 0.05f, 1.0f};

ImagePyramid Base() {
  return Picture(96, 80, 3, 1, Pattern);
}

// The base moved by (1.3, -0.7), with each channel's gain and bias changed.
ImagePyramid Moved(double gain = 1.0, double bias = 0.0) {
  return Picture(96, 80, 3, 1, [=](double x, double y, double c) {
    return (gain + 0.1 * c * (gain - 1)) * Pattern(x - 1.3, y + 0.7, c) + bias * (1 + c);
  });
}

struct Result {
  int iterations;
  AffineState state;
};

Result Solve(Template& t, const ImagePyramid& image, color_mode mode, int max_iterations = 25,
             AffineState start = {40.25f, 36.5f},
             const solver_tolerances& tolerances = kTolerances) {
  translation_normal normal;
  if (!PrepareTranslation(t.plane(), t.shape(), mode, normal)) return {-2, start};
  const int k = SolveTranslation(t.plane(), t.shape(), normal, Level0(image), mode, tolerances,
                                 max_iterations, start, t.window());
  return {k, start};
}

TEST(TranslationSolverTest, IteratesOfASmoothImage) {
  const ImagePyramid base = Base(), moved = Moved();
  Template t(base, 7, 40.25f, 36.5f);
  const double expected[3][2] = {{1.33635, -0.51182}, {1.30169, -0.69852}, {1.30126, -0.69530}};
  for (int k = 1; k <= 3; ++k) {
    const Result result = Solve(t, moved, color_mode::none, k);
    // The third step is the first under the tolerance; a limit that it just reaches is not met.
    EXPECT_EQ(result.iterations, k == 3 ? 2 : k);
    EXPECT_NEAR(result.state.dx, expected[k - 1][0], 2e-5) << k;
    EXPECT_NEAR(result.state.dy, expected[k - 1][1], 2e-5) << k;
  }
  EXPECT_EQ(Solve(t, moved, color_mode::none).iterations, 2);
  EXPECT_EQ(Solve(t, base, color_mode::none).iterations, 0) << "nothing moved";
  const Result none = Solve(t, moved, color_mode::none, 0);
  EXPECT_EQ(none.iterations, 0) << "also the number of iterations allowed";
  EXPECT_EQ(none.state.dx, 0.0f);
}

TEST(TranslationSolverTest, GainAndBiasArePutDownToTheColoursNotTheMotion) {
  const ImagePyramid base = Base(), moved = Moved(0.9, 4.0);
  Template t(base, 7, 40.25f, 36.5f);
  for (const color_mode mode : {color_mode::joint, color_mode::regressed}) {
    SCOPED_TRACE(static_cast<int>(mode));
    const bool joint = mode == color_mode::joint;
    const Result result = Solve(t, moved, mode, 200, {40.25f, 36.5f}, joint ? kTolerances : kFine);
    ASSERT_GE(result.iterations, 0);
    ASSERT_LT(result.iterations, joint ? 5 : 200);
    EXPECT_NEAR(result.state.dx, 1.3, 0.02);
    EXPECT_NEAR(result.state.dy, -0.7, 0.02);
    for (int c = 0; c < 3; ++c) {
      const double gain = 0.9 - 0.01 * c, bias = 4.0 * (1 + c);
      EXPECT_NEAR(result.state.gain[c], 1 / gain, 0.01) << c;
      EXPECT_NEAR(result.state.bias[c], -bias / gain, 1.2) << c;
    }
  }
  const Result blind = Solve(t, moved, color_mode::none);
  EXPECT_GT(std::hypot(blind.state.dx - 1.3, blind.state.dy + 0.7), 0.05);
}

// One iteration from a start that is off in everything.
TEST(TranslationSolverTest, AStepIsTheLeastSquaresStep) {
  const ImagePyramid base = Base(), moved = Moved(0.9, 4.0);
  Template t(base, 7, 40.25f, 36.5f);
  AffineState start(40.25f, 36.5f);
  start.dx = 0.8f;
  start.gain[1] = 1.05f;
  start.bias[2] = -3.0f;
  const Result result = Solve(t, moved, color_mode::joint, 1, start);
  const std::vector<double> step = PlainStep(t, start, 2, true);
  EXPECT_NEAR(result.state.dx, 0.8 + step[0], 1e-4);
  EXPECT_NEAR(result.state.dy, step[1], 1e-4);
  for (int c = 0; c < 3; ++c) {
    const double e = std::exp(step[2 + 2 * c]);
    EXPECT_NEAR(result.state.gain[c], start.gain[c] * e, 1e-4) << c;
    EXPECT_NEAR(result.state.bias[c], (start.bias[c] + step[3 + 2 * c]) * e, 2e-2) << c;
  }
  // The regressed fit is of the sample before the step, and the step is of what it leaves.
  const Result regressed = Solve(t, moved, color_mode::regressed, 1, start);
  for (int c = 0; c < 3; ++c) {
    double n = 0, i = 0, ii = 0, tt = 0, it = 0;
    for (std::size_t k = c; k < 3 * t.shape().pixels(); k += 3) {
      const Sample s(t.shape(), t.plane(), k);
      const double sample = t.window()[s.at], wanted = s.value;
      n += 1, i += sample, ii += sample * sample, tt += wanted, it += sample * wanted;
    }
    EXPECT_NEAR(regressed.state.gain[c], (n * it - i * tt) / (n * ii - i * i), 1e-5);
    EXPECT_NEAR(regressed.state.bias[c], (ii * tt - it * i) / (n * ii - i * i), 1e-3);
  }
  double xx = 0, xy = 0, yy = 0, bx = 0, by = 0;
  for (std::size_t k = 0; k < 3 * t.shape().pixels(); ++k) {
    const Sample s(t.shape(), t.plane(), k);
    const double gx = s.gx / 2, gy = s.gy / 2;
    const double r =
        s.value - (1.0 * regressed.state.gain[s.c] * t.window()[s.at] + regressed.state.bias[s.c]);
    xx += gx * gx, xy += gx * gy, yy += gy * gy, bx += gx * r, by += gy * r;
  }
  const double determinant = xx * yy - xy * xy;
  EXPECT_NEAR(regressed.state.dx, 0.8 + (yy * bx - xy * by) / determinant, 1e-4);
  EXPECT_NEAR(regressed.state.dy, (xx * by - xy * bx) / determinant, 1e-4);
}

TEST(TranslationSolverTest, ModesThatTrackNothing) {
  const ImagePyramid base = Base();
  Template t(base, 7, 40.25f, 36.5f);
  EXPECT_EQ(Solve(t, base, color_mode::unused).iterations, 25);
  for (const int mode : {-1, 4, 77}) {
    const Result result = Solve(t, base, static_cast<color_mode>(mode));
    EXPECT_EQ(result.iterations, kLevelFailed);
    EXPECT_EQ(result.state.dx, 0.0f);
  }
}

TEST(TranslationSolverTest, TheSampleMayReachOneColumnFurtherThanRow) {
  const ImagePyramid base = Base();  // 96 x 80; whole part 7 to 87 and 7 to 70
  Template t(base, 7, 40.25f, 36.5f);
  const auto fails = [&](float x, float y) {
    return Solve(t, base, color_mode::none, 1, AffineState(x, y)).iterations == kLevelFailed;
  };
  EXPECT_FALSE(fails(7, 40));
  EXPECT_TRUE(fails(6.99f, 40));
  EXPECT_FALSE(fails(87.99f, 40));
  EXPECT_TRUE(fails(88, 40));
  EXPECT_FALSE(fails(40, 7));
  EXPECT_TRUE(fails(40, 6.99f));
  EXPECT_FALSE(fails(40, 70.99f));
  EXPECT_TRUE(fails(40, 71));
  EXPECT_TRUE(fails(kNaN, 40));
  EXPECT_TRUE(fails(40, INFINITY));
  // 16 x 17 pixels hold one window of 15; a row or a column less hold none.
  for (const auto& [w, h, held] : {std::tuple{16, 17, true}, {15, 17, false}, {16, 16, false}}) {
    const ImagePyramid small = Picture(w, h, 3, 1, Pattern);
    EXPECT_EQ(Solve(t, small, color_mode::none, 1, AffineState(7, 7)).iterations, held ? 1 : -1);
  }
}

TEST(TranslationSolverTest, FlatWindowsFail) {
  const ImagePyramid flat = Picture(96, 80, 3, 1, [](double, double, double) { return 77.0; });
  Template t(flat, 7, 40.25f, 36.5f);
  translation_normal normal;
  EXPECT_FALSE(PrepareTranslation(t.plane(), t.shape(), color_mode::joint, normal));
  const ImagePyramid base = Base();
  for (const color_mode mode : {color_mode::none, color_mode::regressed}) {
    EXPECT_EQ(Solve(t, base, mode).iterations, kLevelFailed);
    EXPECT_EQ(Solve(t, flat, mode).iterations, kLevelFailed);
  }
  // A good template over a flat place of the image.
  Template good(base, 7, 40.25f, 36.5f);
  EXPECT_EQ(Solve(good, flat, color_mode::regressed).iterations, kLevelFailed);
}

}  // namespace
}  // namespace marrow::tracking
