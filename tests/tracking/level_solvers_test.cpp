#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <vector>

#include "tests/tracking/tracker_images.h"
#include "tracking/correlation.h"

namespace marrow::tracking {
namespace {

using testing::kNaN;
using testing::Pattern;
using testing::Picture;
using testing::PlainStep;
using testing::Sample;
using testing::Template;

enum class motion { translation, affine };
constexpr motion kBoth[] = {motion::translation, motion::affine};
constexpr color_mode kNone = color_mode::none, kJoint = color_mode::joint;

constexpr float kX = 40.25f, kY = 36.5f;
constexpr int kSingular = -2;

ImagePyramid Base() {
  return Picture(96, 80, 3, 1, Pattern);
}

ImagePyramid Moved() {
  return Picture(96, 80, 3, 1,
                 [](double x, double y, double c) { return Pattern(x - 1.3, y + 0.7, c); });
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

Result Solve(motion of, Template& t, const ImagePyramid& image, color_mode mode,
             int max_iterations = 25, AffineState start = {kX, kY},
             const solver_tolerances& tolerances = {0.1f, 0.05f, 0.05f, 1.0f}) {
  if (of == motion::translation) {
    translation_normal normal;
    if (!PrepareTranslation(t.plane(), t.shape(), mode, normal)) return {kSingular, start};
    const int k = SolveTranslation(t.plane(), t.shape(), normal, image.Level(0), mode, tolerances,
                                   max_iterations, start, t.window());
    return {k, start};
  }
  packed_cholesky normal;
  if (!PrepareAffine(t.plane(), t.shape(), mode == kJoint, normal)) return {kSingular, start};
  const int k = SolveAffine(t.plane(), t.shape(), normal, image.Level(0), mode, tolerances,
                            max_iterations, start, t.window());
  return {k, start};
}

// values: dx, dy, a, b, c, d.
void ExpectMotion(const AffineState& found, const std::vector<double>& values,
                  double shift_tolerance, double warp_tolerance) {
  EXPECT_NEAR(found.dx, values[0], shift_tolerance);
  EXPECT_NEAR(found.dy, values[1], shift_tolerance);
  EXPECT_NEAR(found.a, values[2], warp_tolerance);
  EXPECT_NEAR(found.b, values[3], warp_tolerance);
  EXPECT_NEAR(found.c, values[4], warp_tolerance);
  EXPECT_NEAR(found.d, values[5], warp_tolerance);
}

TEST(LevelSolverTest, FindsAMotionInSoManySteps) {
  const ImagePyramid base = Base(), moved = Moved(), warped = Warped();
  Template t(base, 7, kX, kY);
  ExpectMotion(Solve(motion::translation, t, moved, kNone).state, {1.30126, -0.69530, 0, 0, 0, 0},
               2e-5, 0);
  const AffineState warp = Solve(motion::affine, t, warped, kJoint).state;
  ExpectMotion(warp, {0.7957, -0.5026, 0.0285, 0.0191, -0.0150, -0.0222}, 1e-4, 1e-4);
  EXPECT_NEAR(warp.gain[0], 1.1111, 1e-3);
  EXPECT_NEAR(warp.bias[0], -11.28, 2e-2);
  EXPECT_GT(NormalisedCorrelation(t.shape(), t.plane(), t.window()), 0.9999f);
  for (const motion of : kBoth) {
    const bool shift = of == motion::translation;
    // The third step is the first under the tolerance; a limit that it just reaches is not met.
    for (const int limit : {0, 1, 2, 3, 25}) {
      const Result result = Solve(of, t, shift ? moved : warped, shift ? kNone : kJoint, limit);
      EXPECT_EQ(result.iterations, std::min(limit, 2));
      EXPECT_EQ(result.state.dx == 0.0f, limit == 0);
    }
    EXPECT_EQ(Solve(of, t, base, kNone).iterations, 0) << "nothing moved";
  }
}

// Each tolerance alone holds back a solver that is content with everything else.
TEST(LevelSolverTest, EveryToleranceIsAsked) {
  const ImagePyramid base = Base(), warped = Warped();
  Template t(base, 7, kX, kY);
  const solver_tolerances loose{9, 9, 9, 999};
  for (const motion of : kBoth) {
    EXPECT_EQ(Solve(of, t, warped, kJoint, 9, {kX, kY}, loose).iterations, 0);
    for (float solver_tolerances::*one :
         {&solver_tolerances::translation, &solver_tolerances::affine,
          &solver_tolerances::color_lambda, &solver_tolerances::color_delta}) {
      solver_tolerances strict = loose;
      strict.*one = 1e-3f;
      const bool asked = of == motion::affine || one != &solver_tolerances::affine;
      EXPECT_EQ(Solve(of, t, warped, kJoint, 9, {kX, kY}, strict).iterations > 0, asked);
    }
  }
}

// One iteration from a start that is off in everything.
TEST(LevelSolverTest, AStepIsTheLeastSquaresStep) {
  const ImagePyramid base = Base(), warped = Warped();
  Template t(base, 7, kX, kY);
  AffineState start(kX, kY);
  start.dx = 0.4f;
  start.gain[1] = 1.05f, start.bias[2] = -3.0f;
  for (const auto& [of, mode] : {std::pair{motion::translation, kNone},
                                 {motion::translation, kJoint},
                                 {motion::translation, color_mode::regressed},
                                 {motion::affine, kNone},
                                 {motion::affine, kJoint}}) {
    SCOPED_TRACE(::testing::Message() << static_cast<int>(of) << static_cast<int>(mode));
    start.b = of == motion::affine ? 0.03f : 0.0f;
    start.d = of == motion::affine ? -0.05f : 0.0f;
    const AffineState found = Solve(of, t, warped, mode, 1, start).state;
    // The image at the start is in the window.
    AffineState expected = start, applied = mode == kNone ? AffineState() : start;
    if (mode == color_mode::regressed) {
      // The fit is of the sample before the step, and the step is of what it leaves.
      for (std::size_t c = 0; c < 3; ++c) {
        double n = 0, i = 0, ii = 0, tt = 0, it = 0;
        for (std::size_t k = c; k < 3 * t.shape().pixels(); k += 3) {
          const Sample s(t.shape(), t.plane(), k);
          const double sample = t.window()[s.at], wanted = s.value;
          n += 1, i += sample, ii += sample * sample, tt += wanted, it += sample * wanted;
        }
        applied.gain[c] = (n * it - i * tt) / (n * ii - i * i);
        applied.bias[c] = (ii * tt - it * i) / (n * ii - i * i);
      }
      expected = applied;
    }
    const std::size_t rows = of == motion::affine ? 6 : 2;
    const std::vector<double> step = PlainStep(t, applied, rows, mode == kJoint);
    if (of == motion::affine) ComposeAffine(step.data(), expected);
    if (of != motion::affine) expected.dx += step[0], expected.dy += step[1];
    ExpectMotion(found, {expected.dx, expected.dy, expected.a, expected.b, expected.c, expected.d},
                 1e-4, 1e-5);
    for (std::size_t c = 0; c < 3; ++c) {
      const double e = mode == kJoint ? std::exp(step[rows + 2 * c]) : 1.0;
      const double moved = expected.bias[c] + (mode == kJoint ? step[rows + 1 + 2 * c] : 0.0);
      EXPECT_NEAR(found.gain[c], expected.gain[c] * e, 1e-4) << c;
      EXPECT_NEAR(found.bias[c], moved * e, 2e-2) << c;
    }
  }
}

TEST(LevelSolverTest, WarpsCompose) {
  AffineState state(kX, kY);
  state.a = 0.02f, state.b = 0.01f, state.c = -0.02f, state.d = -0.03f;
  const double step[] = {0.3, -0.2, 0.01, -0.02, 0.03, 0.005};
  ComposeAffine(step, state);
  ExpectMotion(state, {0.31112464, -0.19213717, 0.02998022, -0.01065287, 0.00933394, -0.02531325},
               2e-7, 2e-7);
}

// In 96 x 80 pixels a shifted window of 15 has a whole part from 7 to 87 and from 7 to 70; the
// corners of a warped one lie strictly between the outermost pixels.
TEST(LevelSolverTest, HowFarAWindowMayReach) {
  const ImagePyramid base = Base();
  Template t(base, 7, kX, kY);
  const auto fails = [&](motion of, AffineState state) {
    return Solve(of, t, base, kNone, 1, state).iterations == kLevelFailed;
  };
  const struct {
    float x, y;
    bool shifted, warped;
  } places[] = {{6.99f, 40, false, false}, {7, 40, true, false},      {7.01f, 40, true, true},
                {87.99f, 40, true, true},  {88, 40, false, false},    {40, 6.99f, false, false},
                {40, 7, true, false},      {40, 7.01f, true, true},   {40, 70.99f, true, true},
                {40, 71, false, true},     {40, 71.99f, false, true}, {40, 72, false, false}};
  for (const auto& p : places) {
    EXPECT_EQ(fails(motion::translation, {p.x, p.y}), !p.shifted) << p.x << ',' << p.y;
    EXPECT_EQ(fails(motion::affine, {p.x, p.y}), !p.warped) << p.x << ',' << p.y;
  }
  AffineState wide(40, 12);
  EXPECT_FALSE(fails(motion::affine, wide));
  wide.d = 0.8f;
  EXPECT_TRUE(fails(motion::affine, wide));
  for (float AffineState::*field : {&AffineState::dx, &AffineState::dy, &AffineState::a,
                                    &AffineState::b, &AffineState::c, &AffineState::d}) {
    for (const float bad : {kNaN, INFINITY, 1e30f, -1e30f}) {
      AffineState broken(40, 40);
      broken.*field = bad;
      EXPECT_TRUE(fails(motion::affine, broken)) << bad;
      const bool moves = field == &AffineState::dx || field == &AffineState::dy;
      EXPECT_EQ(fails(motion::translation, broken), moves) << bad;
    }
  }
  // 16 x 17 pixels hold one window of 15; a row or a column less hold none.
  for (const auto& [w, h, held] : {std::tuple{16, 17, true}, {15, 17, false}, {16, 16, false}}) {
    const ImagePyramid small = Picture(w, h, 3, 1, Pattern);
    EXPECT_EQ(Solve(motion::translation, t, small, kNone, 1, {7, 7}).iterations, held ? 1 : -1);
  }
}

TEST(LevelSolverTest, WindowsThatDoNotTellTheMotion) {
  const auto flat = [](double, double, double) { return 77.0; };
  const auto stripes = [](double x, double, double) { return 100 + 50 * std::sin(x); };
  // One flat channel has no gain apart from its bias, but motion enough.
  const auto half_flat = [](double x, double y, double c) {
    return c == 1 ? 80 : Pattern(x, y, c);
  };
  const auto prepare = [](motion of, auto value, color_mode mode) {
    const ImagePyramid image = Picture(96, 80, 3, 1, value);
    Template t(image, 7, kX, kY);
    return Solve(of, t, image, mode).iterations;
  };
  for (const motion of : kBoth) {
    EXPECT_EQ(prepare(of, flat, kJoint), kSingular);
    EXPECT_EQ(prepare(of, stripes, kJoint), kSingular);
    EXPECT_EQ(prepare(of, half_flat, kJoint), kSingular);
    EXPECT_EQ(prepare(of, half_flat, kNone), 0);
    EXPECT_EQ(prepare(of, Pattern, kJoint), 0);
  }
  // Without colours a shift has a matrix of two rows, whose inverse is not finite then.
  EXPECT_EQ(prepare(motion::affine, flat, kNone), kSingular);
  EXPECT_EQ(prepare(motion::affine, stripes, kNone), kSingular);
  for (const color_mode mode : {kNone, color_mode::regressed}) {
    EXPECT_EQ(prepare(motion::translation, flat, mode), kLevelFailed);
  }
  // A good template over a flat place of the image.
  const ImagePyramid base = Base(), plain = Picture(96, 80, 3, 1, flat);
  Template good(base, 7, kX, kY);
  EXPECT_EQ(Solve(motion::translation, good, plain, color_mode::regressed).iterations,
            kLevelFailed);
  // Values that are no numbers are no matrix.
  packed_cholesky normal;
  const double nan = kNaN;
  EXPECT_FALSE(normal.Factor(&nan, 1));
}

}  // namespace
}  // namespace marrow::tracking
