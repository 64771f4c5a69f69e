#include "host/stabilize/measures.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <functional>
#include <numbers>

namespace calmframe::host {
namespace {

constexpr double kRate = 30, kWidth = 500;

// Ten seconds in which the background's place is at(seconds), in pixels.
ShownMotion Moving(const std::function<double(double)>& at) {
  ShownMotion shown{kWidth, 300, {}, {}, {}, {}, {}, {}};
  for (int f = 0; f < 300; ++f) {
    shown.motions.push_back({1, 0, at((f - 1) / kRate) - at(f / kRate), 0});
  }
  return shown;
}

double Wave(double hertz, double seconds) {
  return std::sin(2 * std::numbers::pi * hertz * seconds);
}

// Of a sine the mean size is 2/pi of its height, and a twentieth lies above sin(85.5 degrees) of
// it; pixels count double in a picture half of 1000 wide.
TEST(MeasureShakeTest, TakesWhatIsFastInThousandthsOfTheWidth) {
  const Shake fast = MeasureShake(Moving([](double s) { return 4 * Wave(11.3, s); }), kRate);
  EXPECT_NEAR(fast.mean, 8 * 2 / std::numbers::pi, 0.25);
  EXPECT_NEAR(fast.p95, 8, 0.25);
  const Shake slow = MeasureShake(Moving([](double s) { return 40 * Wave(0.15, s); }), kRate);
  EXPECT_LT(slow.mean, 0.4);
  const Shake pan = MeasureShake(Moving([](double s) { return 70 * s + 3 * s * s; }), kRate);
  EXPECT_NEAR(pan.mean, 0, 1e-9) << "a parabola is no shake";
}

TEST(MeasureShakeTest, FindsTheWorstSecond) {
  const Shake shake =
      MeasureShake(Moving([](double s) { return (s > 6 && s < 7 ? 5 : 0.5) * Wave(4, s); }), kRate);
  EXPECT_NEAR(shake.worst_at, 6.5, 0.1);
  EXPECT_NEAR(shake.worst, 10 * 2 / std::numbers::pi, 0.6);
  EXPECT_LT(shake.mean, 2);
}

// A turn about the middle moves most places, and so does a change of scale.
TEST(MeasureShakeTest, TurnsAndZoomsAreShakeToo) {
  for (const bool turns : {true, false}) {
    ShownMotion shown{kWidth, 300, {}, {}, {}, {}, {}, {}};
    for (int f = 0; f < 300; ++f) {
      const double step = 0.01 * (f % 2 == 0 ? 1 : -1);
      shown.motions.push_back(turns ? Similarity{1, step, 0, 0} : Similarity{1 + step, 0, 0, 0});
    }
    // Half a step, at the median distance of the 25 places from the middle: 195 pixels.
    EXPECT_NEAR(MeasureShake(shown, kRate).mean, 0.005 * 195 * 2, 0.15) << turns;
  }
}

// Of three tracks that sway the one in the middle counts; one that is too short, and frames near a
// track's ends, don't.
TEST(MeasureTrackShakeTest, TakesTheMedianOfTracksThatLast) {
  ShownMotion shown{kWidth, 300, std::vector<Similarity>(300), {}, {}, {}, {}, {}};
  std::vector<TrackPath> paths;
  for (const double height : {1.0, 4.0, 50.0}) {
    TrackPath path{40, {}};
    for (int i = 0; i < 200; ++i) path.points.push_back({3.0 * i, height * Wave(11.3, i / kRate)});
    paths.push_back(path);
  }
  shown.paths = std::make_shared<const std::vector<TrackPath>>(paths);
  EXPECT_NEAR(MeasureTrackShake(shown, kRate), 8 * 2 / std::numbers::pi, 0.25);
  // What takes them all to the output, twice as large.
  shown.to_output.assign(300, Similarity{2, 0, 7, 0});
  EXPECT_NEAR(MeasureTrackShake(shown, kRate), 2 * 8 * 2 / std::numbers::pi, 0.5);
  for (TrackPath& path : paths) path.points.resize(36);  // 0.6 s to both sides are 37
  shown.paths = std::make_shared<const std::vector<TrackPath>>(paths);
  EXPECT_EQ(MeasureTrackShake(shown, kRate), 0);
}

// A pan that comes a second late, of 60 pixels in two seconds: by 30 at most, 60 thousandths of the
// width. What is faster than the parabola's reach is no straying, and a frame without a place has
// the one before.
TEST(MeasureStrayingTest, APanThatLagsStrays) {
  const auto strays = [](const std::function<double(double)>& at) {
    ShownMotion shown{kWidth, 300, {}, {}, {}, {}, {}, {}};
    for (int f = 0; f < 300; ++f) shown.aims.push_back({at(f / kRate), 0});
    shown.aims[20] = {std::nan(""), std::nan("")};
    return MeasureStraying(shown, kRate);
  };
  const auto pan = [](double s) { return 30 * std::clamp(s - 4, 0.0, 2.0); };
  const Straying late = strays([&](double s) { return pan(s - 1) - pan(s); });
  // It lags for three seconds, a mean of 20 pixels; 1.2 of the ten seconds are not measured.
  EXPECT_NEAR(late.mean, 20 * 2 * 3 / 8.8, 0.3);
  EXPECT_NEAR(late.worst, 60, 3);
  EXPECT_NEAR(strays([](double) { return -9; }).mean, 18, 1e-9);
  EXPECT_LT(strays([](double s) { return 9 * Wave(8, s); }).worst, 2.5);
}

TEST(MeasureShakeTest, AFewFramesHaveNone) {
  ShownMotion shown{kWidth, 300, std::vector<Similarity>(4, Similarity{1, 0, 9, 0}), {}, {}, {},
                    {},     {}};
  EXPECT_EQ(MeasureShake(shown, kRate).mean, 0);
  shown.motions.clear();
  EXPECT_EQ(MeasureShake(shown, kRate).worst, 0);
}

}  // namespace
}  // namespace calmframe::host
