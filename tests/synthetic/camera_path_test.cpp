#include "synthetic/camera_path.h"

#include <gtest/gtest.h>

#include <cmath>

namespace synthetic {
namespace {

TEST(JitteredPathTest, IntendedMotionAtQuarterPeriods) {
  const camera_path path = jittered_path(300, {.gain = 0.5});
  EXPECT_NEAR(path.intended(100).rotation[0], 0.05, 1e-12);
  EXPECT_NEAR(path.intended(0).rotation[1], 0.1 * std::sin(0.3), 1e-12);
  EXPECT_NEAR(path.intended(125).rotation[2], 0.015, 1e-12);
  EXPECT_NEAR(path.intended(175).centre[0], 1.0, 1e-12);
  EXPECT_NEAR(path.intended(112.5).centre[1], 0.2, 1e-12);
  EXPECT_NEAR(path.intended(250).centre[2], 0.5, 1e-12);
}

TEST(JitteredPathTest, JitterHasItsDeviationAndSparesTheFirstFrame) {
  const int frames = 4000;
  const camera_path path = jittered_path(frames, {.seed = 5});
  EXPECT_EQ(path.shaken(0).rotation, path.intended(0).rotation);
  EXPECT_EQ(path.shaken(0).centre, path.intended(0).centre);
  double rotation = 0, centre = 0, neighbours = 0;
  for (int t = 1; t + 1 < frames; ++t) {
    const double r = path.shaken(t).rotation[1] - path.intended(t).rotation[1];
    const double next = path.shaken(t + 1).rotation[1] - path.intended(t + 1).rotation[1];
    const double c = path.shaken(t).centre[2] - path.intended(t).centre[2];
    rotation += r * r / frames;
    centre += c * c / frames;
    neighbours += r * next / frames;
    const double between = path.shaken(t + 0.25).rotation[1] - path.intended(t + 0.25).rotation[1];
    ASSERT_NEAR(between, 0.75 * r + 0.25 * next, 1e-12);
  }
  EXPECT_NEAR(std::sqrt(rotation), 2e-3, 1e-4);
  EXPECT_NEAR(std::sqrt(centre), 0.01, 5e-4);
  EXPECT_LT(std::abs(neighbours), 0.06 * rotation) << "white";
}

TEST(HandheldPathTest, ShakeHasItsSizeAndSpectrum) {
  const camera_path path = handheld_path({});
  const int frames = 30 * 120;
  double power = 0, step = 0;
  for (int t = 0; t < frames; ++t) {
    const auto shake = [&](double time) {
      return path.shaken(time).rotation[0] - path.intended(time).rotation[0];
    };
    power += shake(t) * shake(t) / frames;
    // A step of 1/600 s: short even against the highest frequency.
    const double d = (shake(t + 0.05) - shake(t)) * 600;
    step += d * d / frames;
  }
  EXPECT_NEAR(std::sqrt(power), 0.010, 0.001);
  // The root mean square pulsation of the spectrum lies inside its band.
  const double hertz = std::sqrt(step / power) / (2 * M_PI);
  EXPECT_GT(hertz, 0.8);
  EXPECT_LT(hertz, 9.0);
  EXPECT_NE(handheld_path({.seed = 2}).shaken(7).rotation, path.shaken(7).rotation);
  EXPECT_EQ(handheld_path({}).shaken(7).rotation, path.shaken(7).rotation);
}

}  // namespace
}  // namespace synthetic
