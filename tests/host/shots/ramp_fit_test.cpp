#include "host/shots/ramp_fit.h"

#include <gtest/gtest.h>

#include <cmath>
#include <functional>
#include <vector>

#include "tests/host/shots/drawn_digest.h"

namespace calmframe::host {
namespace {

constexpr int kRampFrames = 15, kRampBefore = 3, kRampBehind = 11;

double RampShareAt(int t) {
  return std::clamp((t - kRampBefore) / 1.0 / (kRampBehind - kRampBefore), 0.0, 1.0);
}

// What the fits say of frames of which each has `value(t, x, y)` at a cell.
struct Fits {
  DipFit dip;
  ToneFit tone;
};
Fits FitsOf(const std::function<double(int t, double x, double y)>& value) {
  std::vector<FrameParts> parts;
  for (int t = 0; t < kRampFrames; ++t) {
    const FrameDigest digest = DrawDigest([&](double x, double y) { return value(t, x, y); });
    parts.push_back(PartsOf(digest, DetailOf(digest)));
  }
  Ramp ramp;
  for (const FrameParts& frame : parts) ramp.frames.push_back(&frame);
  ramp.before = kRampBefore;
  ramp.behind = kRampBehind;
  return {FitDip(ramp), FitTone(ramp)};
}

// Pictures that jump by several cells from frame to frame: none lies where the last one did. The
// second is brighter at its right.
double FirstShot(int t, double x, double y) {
  return Waves(1, x + 5 * std::sin(2.1 * t), y + 3 * std::cos(1.3 * t));
}
double SecondShot(int t, double x, double y) {
  return x + 0.6 * Waves(2, x + 4 * std::cos(1.7 * t), y + 3 * std::sin(2.9 * t));
}

TEST(RampFitTest, ADissolveOfShakenPictures) {
  const Fits fits = FitsOf([](int t, double x, double y) {
    return (1 - RampShareAt(t)) * FirstShot(t, x, y) + RampShareAt(t) * SecondShot(t, x, y);
  });
  EXPECT_GT(fits.dip.evidence, 0.5);
  EXPECT_NEAR(fits.dip.depth, 1, 0.2);
  EXPECT_GT(fits.tone.straight, 0.6);
  EXPECT_GT(fits.tone.apart, 0.5);
  EXPECT_NEAR(fits.tone.light, 0, 0.05);
}

TEST(RampFitTest, WhatIsNone) {
  const Fits shaken = FitsOf(FirstShot);
  EXPECT_LT(shaken.dip.evidence, 0.1);
  // One picture's parts give way to the other's from left to right.
  const Fits wiped = FitsOf([](int t, double x, double y) {
    return x < 64 * RampShareAt(t) ? SecondShot(t, x, y) : FirstShot(t, x, y);
  });
  EXPECT_LT(wiped.dip.evidence, 0.1);
  // By way of grey: at the middle nothing is left, where a mixture has half.
  const Fits faded = FitsOf([](int t, double x, double y) {
    const double left = 1 - 2 * RampShareAt(t);
    return 128 + std::abs(left) * ((left > 0 ? FirstShot(t, x, y) : SecondShot(t, x, y)) - 128);
  });
  EXPECT_GT(faded.dip.depth, 1.5);
  // A light goes down to 0.6 and comes back.
  const Fits dimmed = FitsOf([](int t, double x, double y) {
    return (1 - 1.6 * RampShareAt(t) * (1 - RampShareAt(t))) * FirstShot(t, x, y);
  });
  EXPECT_NEAR(dimmed.tone.light, -0.4, 0.03);
}

}  // namespace
}  // namespace calmframe::host
