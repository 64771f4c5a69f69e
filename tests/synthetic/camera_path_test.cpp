#include "synthetic/camera_path.h"

#include <gtest/gtest.h>

#include <cmath>

namespace synthetic {
namespace {

TEST(JitteredPathTest, JitterIsLinearBetweenFramesAndSparesTheFirst) {
  const camera_path path = jittered_path(4000, {.seed = 5});
  const auto off = [&](double t) { return path.shaken(t).centre[2] - path.intended(t).centre[2]; };
  EXPECT_EQ(path.shaken(0).rotation, path.intended(0).rotation);
  double square = 0, neighbours = 0;
  for (int t = 1; t + 1 < 4000; ++t) {
    square += off(t) * off(t) / 4000;
    neighbours += off(t) * off(t + 1) / 4000;
    ASSERT_NEAR(off(t + 0.25), 0.75 * off(t) + 0.25 * off(t + 1), 1e-12);
  }
  EXPECT_NEAR(std::sqrt(square), 0.01, 5e-4);
  EXPECT_LT(std::abs(neighbours), 0.06 * square) << "white";
}

TEST(HandheldPathTest, ShakeHasItsSizeAndSpectrum) {
  const camera_path path = handheld_path({});
  const auto shake = [&](double time) {
    return path.shaken(time).rotation[0] - path.intended(time).rotation[0];
  };
  const int frames = 30 * 120;
  double power = 0, step = 0;
  for (int t = 0; t < frames; ++t) {
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
}

}  // namespace
}  // namespace synthetic
