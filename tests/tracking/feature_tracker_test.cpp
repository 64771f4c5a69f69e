#include "tracking/feature_tracker.h"

#include <gmock/gmock.h>

#include <cmath>
#include <vector>

#include "tests/tracking/tracker_images.h"

namespace marrow::tracking {
namespace {

using ::testing::ElementsAre;
using testing::Picture;
using Cell = tracking_feature<float>;

constexpr std::size_t kWidth = 160, kHeight = 128;

// Coarse shapes under a fine texture whose period is nine pixels.
double Texture(double x, double y, double c) {
  return 120 + 40 * std::sin(0.11 * x + 0.05 * y + c) + 40 * std::cos(0.10 * y - 0.04 * x) +
         22 * std::sin(0.7 * x + 0.2 * y) * std::cos(0.65 * y);
}
// The same fine period over other shapes.
double OtherTexture(double x, double y, double c) {
  return 120 + 45 * std::sin(0.31 * x - 0.22 * y + 2 + c) + 45 * std::cos(0.27 * x * y / 40);
}
double Flat(double, double, double) {
  return 90;
}

template <class Value>
ImagePyramid Frame(Value value, double dx = 0, double dy = 0, std::size_t levels = 4) {
  return Picture(kWidth, kHeight, 3, levels,
                 [&](double x, double y, double c) { return value(x - dx, y - dy, c); });
}

struct Follower {
  explicit Follower(TrackerParams params = {}, std::size_t slots = 1)
      : tracker(params, slots, 3), from(slots), to(slots) {
    statistics.translation.resize(params.pyramidal_levels + 1);
    statistics.verification.resize(params.pyramidal_levels + 1);
  }
  // A feature at (x, y) of the first frame, followed into the second.
  Cell Track(const ImagePyramid& first, const ImagePyramid& second, float x, float y) {
    from[0] = {x, y, 1, 0};
    to[0] = {};
    tracker.TrackFeatures(first, second, from.data(), to.data(), 1, statistics);
    return to[0];
  }
  void Seed(const ImagePyramid& frame, float x, float y) {
    from[0] = {x, y, 1, 0};
    tracker.InitialiseSeeds(frame, from.data());
  }
  Cell Verify(const ImagePyramid& frame, float x, float y) {
    to[0] = {x, y, 0, 0};
    tracker.VerifyFeatures(frame, to.data(), statistics);
    return to[0];
  }
  FeatureTracker tracker;
  std::vector<Cell> from, to;
  TrackingStatistics statistics;
};

TrackerParams With(void (*change)(TrackerParams&)) {
  TrackerParams params;
  params.pyramidal_levels = 4;
  change(params);
  return params;
}

TEST(FeatureTrackerTest, SmallMotionIsFoundOnTheFinestLevelLargeOnACoarserOne) {
  const ImagePyramid still = Frame(Texture);
  Follower run(With([](auto&) {}));
  const Cell near = run.Track(still, Frame(Texture, 0.8, -0.6), 80, 64);
  EXPECT_EQ(near.status, feature_status::kTracked);
  EXPECT_NEAR(near.x, 80.8, 0.05);
  EXPECT_NEAR(near.y, 63.4, 0.05);
  EXPECT_THAT(run.statistics.translation, ElementsAre(0, 1, 0, 0, 0));

  // Further than the finest level reaches.
  for (const std::size_t levels : {4, 1}) {
    TrackerParams params = With([](auto& p) { p.half_win_x = 5; });
    params.pyramidal_levels = levels;
    Follower far(params);
    const Cell cell = far.Track(Frame(testing::Pattern, 0, 0, levels),
                                Frame(testing::Pattern, 11, -6, levels), 80, 56);
    if (levels == 1) {
      EXPECT_EQ(cell.status, feature_status::kLost);
      EXPECT_THAT(far.statistics.translation, ElementsAre(1, 0));
      continue;
    }
    EXPECT_EQ(cell.status, feature_status::kTracked);
    EXPECT_NEAR(cell.x, 91, 0.05);
    EXPECT_NEAR(cell.y, 50, 0.05);
    EXPECT_THAT(far.statistics.translation, ElementsAre(0, 0, 1, 0, 0));
  }
}

TEST(FeatureTrackerTest, DeadCellsStayEmptyAndLiveOnesAreFollowed) {
  const ImagePyramid still = Frame(Texture);
  Follower run(With([](auto&) {}), 8);
  const std::int32_t before[] = {-1, -2, -3, -4, -10, -11, 0, 17};
  for (int s = 0; s < 8; ++s) {
    run.from[s] = {80, 64, before[s], 0};
    run.to[s] = {-5, -6, 99, 0.25f};
  }
  run.tracker.TrackFeatures(still, still, run.from.data(), run.to.data(), 8, run.statistics);
  for (int s = 0; s < 6; ++s) {
    EXPECT_EQ(run.to[s].status, feature_status::kEmpty);
    EXPECT_EQ(run.to[s].x, -5);
    EXPECT_EQ(run.to[s].y, -6);
    EXPECT_EQ(run.to[s].correlation, 0.25f);
  }
  for (int s = 6; s < 8; ++s) {
    EXPECT_EQ(run.to[s].status, feature_status::kTracked);
    EXPECT_NEAR(run.to[s].x, 80, 1e-4);
    EXPECT_EQ(run.to[s].correlation, 0.25f) << "verification's alone";
  }
}

TEST(FeatureTrackerTest, LostByTheTranslationStage) {
  const ImagePyramid still = Frame(Texture), flat = Frame(Flat);
  Follower run(With([](auto&) {}));
  const auto status = [&](const ImagePyramid& first, const ImagePyramid& second, float x, float y) {
    return run.Track(first, second, x, y).status;
  };
  // Half window 7: whole parts 8 to 150 and 8 to 117.
  EXPECT_EQ(status(still, still, 7.9f, 64), feature_status::kLost);
  EXPECT_EQ(status(still, still, 8, 64), feature_status::kTracked);
  EXPECT_EQ(status(still, still, 150.9f, 64), feature_status::kTracked);
  EXPECT_EQ(status(still, still, 151, 64), feature_status::kLost);
  EXPECT_EQ(status(still, still, 80, 118), feature_status::kLost);
  EXPECT_EQ(status(still, still, 80, testing::kNaN), feature_status::kLost);
  EXPECT_EQ(status(still, Frame(Texture, -2.5, 0), 8, 64), feature_status::kLost) << "moved out";
  EXPECT_EQ(status(flat, flat, 80, 64), feature_status::kLost) << "nothing to hold on to";
  EXPECT_EQ(status(still, flat, 80, 64), feature_status::kLost);
  EXPECT_EQ(status(still, Frame(OtherTexture), 80, 64), feature_status::kLost);
  EXPECT_EQ(run.statistics.translation[0], 8u);
  EXPECT_EQ(run.statistics.translation[1], 2u);
  Follower none(With([](auto& p) { p.pyramidal_levels = 0; }));
  EXPECT_EQ(none.Track(still, still, 80, 64).status, feature_status::kLost);
}

TEST(FeatureTrackerTest, ColourModesOfTheTranslationStage) {
  const ImagePyramid still = Frame(Texture);
  const ImagePyramid dim =
      Frame([](double x, double y, double c) { return (0.8 - 0.1 * c) * Texture(x, y, c) + 12; },
            0.6, -0.4);
  const auto track = [&](int mode) {
    TrackerParams params = With([](auto&) {});
    params.color_correction_translation = mode;
    Follower run(params);
    return run.Track(still, dim, 80, 64);
  };
  for (const int mode : {2, 3}) {
    EXPECT_EQ(track(mode).status, feature_status::kTracked) << mode;
    EXPECT_NEAR(track(mode).x, 80.6, 0.05) << mode;
    EXPECT_NEAR(track(mode).y, 63.6, 0.05) << mode;
  }
  for (const int mode : {1, 4, -1}) EXPECT_EQ(track(mode).status, feature_status::kLost) << mode;
}

// Two of three channels are black and flat, so that the correlation is a third at best.
TEST(FeatureTrackerTest, ARedObjectSurvivesByItsMotionAlone) {
  const auto red = [](double x, double y, double c) { return c == 0 ? Texture(x, y, c) : 1.0; };
  const ImagePyramid first = Frame(red), second = Frame(red, 0.7, 0.4);
  for (const int mode : {0, 1, 2, 3, 9}) {  // without a say
    TrackerParams params = With([](auto&) {});
    params.color_correction_translation = params.color_correction_affine = mode;
    Follower run(params);
    run.Seed(first, 80, 64);
    Cell cell = run.Track(first, second, 80, 64);
    ASSERT_EQ(cell.status, feature_status::kTracked) << mode;
    EXPECT_NEAR(cell.x, 80.7, 0.05);
    cell = run.Verify(second, cell.x, cell.y);
    EXPECT_EQ(cell.status, feature_status::kTracked) << mode;
    EXPECT_NEAR(cell.y, 64.4, 0.05);
    EXPECT_NEAR(cell.correlation, 1.0 / 3, 0.01);
    EXPECT_EQ(run.tracker.state(0).gain[0], 1.0f);
  }
  Follower strict(With([](auto& p) { p.tolerance_primary_color_threshold = 0; }));
  EXPECT_EQ(strict.Track(first, second, 80, 64).status, feature_status::kLost);
}

// Turned and zoomed about (80, 64), moved, dimmed.
ImagePyramid Turned(double angle, double zoom, double dx, double gain, double bias) {
  return Picture(kWidth, kHeight, 3, 4, [=](double x, double y, double c) {
    const double u = (x - 80 - dx) / zoom, v = (y - 64) / zoom;
    return gain * Texture(80 + std::cos(angle) * u + std::sin(angle) * v,
                          64 - std::sin(angle) * u + std::cos(angle) * v, c) +
           bias;
  });
}

// The warp of each frame starts from that of the frame before: from the first frame at once the
// last one is out of reach.
TEST(VerificationTest, WarpAndColoursGrowFromFrameToFrame) {
  Follower run(With([](auto&) {}));
  const ImagePyramid first = Turned(0, 1, 0, 1, 0);
  run.Seed(first, 80, 64);
  ImagePyramid last;
  for (int f = 1; f <= 20; ++f) {
    const double part = f / 20.0;
    last = Turned(1.4 * part, 1 + 0.2 * part, 0.4 * f, 1 - 0.4 * part, 20 * part);
    // The frame-to-frame stage hands over a place that is off.
    const Cell cell = run.Verify(last, 80 + 0.4f * f + 0.3f, 64 - 0.3f);
    ASSERT_EQ(cell.status, feature_status::kTracked) << f;
    ASSERT_NEAR(cell.x, 80 + 0.4 * f, 0.1) << f;
    ASSERT_NEAR(cell.y, 64, 0.1) << f;
    ASSERT_GT(cell.correlation, 0.97f);
  }
  const AffineState& state = run.tracker.state(0);
  EXPECT_NEAR(1 + state.a, 1.2 * std::cos(1.4), 0.03);
  EXPECT_NEAR(state.b, -1.2 * std::sin(1.4), 0.03);
  EXPECT_NEAR(state.c, 1.2 * std::sin(1.4), 0.03);
  EXPECT_NEAR(1 + state.d, 1.2 * std::cos(1.4), 0.03);
  EXPECT_NEAR(state.gain[0], 1 / 0.6, 0.1);
  EXPECT_EQ(run.statistics.verification[0], 0u);
  EXPECT_EQ(run.statistics.verification[1], 20u);
  // A seed in the slot starts anew.
  run.Seed(first, 80, 64);
  EXPECT_EQ(run.tracker.state(0).a, 0.0f);
  EXPECT_EQ(run.tracker.state(0).gain[0], 1.0f);
  EXPECT_EQ(run.Verify(last, 88, 64).status, feature_status::kRejectedCorrelation);
}

TEST(VerificationTest, RejectedAfterAFailedSearch) {
  const ImagePyramid still = Frame(Texture), other = Frame(OtherTexture), flat = Frame(Flat);
  Follower run(With([](auto&) {}));
  const auto status = [&](const ImagePyramid& seed, const ImagePyramid& now, float x, float y) {
    run.Seed(seed, 80, 64);
    const Cell cell = run.Verify(now, x, y);
    EXPECT_EQ(cell.correlation, 0.0f);
    EXPECT_EQ(cell.x, x) << "a rejected place stays as it was";
    return cell.status;
  };
  EXPECT_EQ(status(still, other, 80, 64), feature_status::kRejectedCorrelation);
  EXPECT_EQ(status(still, flat, 80, 64), feature_status::kRejectedCorrelation);
  EXPECT_EQ(status(still, still, 7, 64), feature_status::kRejectedCorrelation) << "at the edge";
  EXPECT_EQ(status(flat, flat, 80, 64), feature_status::kRejectedCorrelation) << "singular";
  EXPECT_EQ(run.statistics.verification[0], 4u);
  // The limit of a window with a dark channel is under the correlation that was never written.
  const ImagePyramid red =
      Frame([](double x, double y, double c) { return c == 0 ? Texture(x, y, c) : 1.0; });
  EXPECT_EQ(status(red, red, 7, 64), feature_status::kRejected);
  // A seed too near to the edge for a template.
  run.Seed(still, 4, 64);
  EXPECT_EQ(run.Verify(still, 20, 64).status, feature_status::kRejectedCorrelation);
}

// Coarse shapes agree, so an attempt from a coarser level succeeds; the fine ones do not.
TEST(VerificationTest, RejectedByTheCorrelationOfTheFinestLevel) {
  const auto grain = [](double phase) {
    return [=](double x, double y, double c) {
      const double hash = std::sin(12.9898 * x + 78.233 * y + phase) * 43758.5453;
      return 120 + 40 * std::sin(0.11 * x + c) + 40 * std::cos(0.10 * y) +
             60 * (hash - std::floor(hash) - 0.5);
    };
  };
  TrackerParams params = With([](auto& p) { p.tolerance_min_correlation = 0.6; });
  Follower run(params);
  int rejected_with_correlation = 0;
  for (int x = 40; x < 120; x += 5) {
    run.Seed(Frame(grain(0)), x, 64);
    const Cell cell = run.Verify(Frame(grain(1)), x, 64);
    ASSERT_EQ(cell.status, feature_status::kRejectedCorrelation);
    ASSERT_LT(cell.correlation, 0.6f);
    rejected_with_correlation += cell.correlation != 0.0f;
  }
  EXPECT_GT(rejected_with_correlation, 0);
}

TEST(VerificationTest, OtherCellsArePassedOver) {
  const ImagePyramid still = Frame(Texture);
  Follower run(With([](auto&) {}));
  run.Seed(still, 80, 64);
  for (const std::int32_t status : {5, -1, -2, -10}) {
    run.to[0] = {80.3f, 64, status, 0.5f};
    run.tracker.VerifyFeatures(still, run.to.data(), run.statistics);
    EXPECT_EQ(run.to[0].status, status);
    EXPECT_EQ(run.to[0].x, 80.3f);
    EXPECT_EQ(run.to[0].correlation, 0.5f);
  }
  // And all of them without verification.
  Follower off(With([](auto& p) { p.affine_verification = false; }));
  off.Seed(still, 80, 64);
  const Cell cell = off.Verify(Frame(OtherTexture), 80.3f, 64);
  EXPECT_EQ(cell.status, feature_status::kTracked);
  EXPECT_EQ(cell.x, 80.3f);
  EXPECT_EQ(cell.correlation, 0.0f);
  EXPECT_THAT(off.statistics.verification, ::testing::Each(0u));
}

// Slots of every fate: moved, lost, rejected, empty.
TEST(VerificationTest, OneWalkOverTheSlotsEndsAsTwoDo) {
  const ImagePyramid first = Frame(Texture);
  const ImagePyramid second = Picture(kWidth, kHeight, 3, 4, [](double x, double y, double c) {
    return x < 80 ? Texture(x - 0.8, y + 0.6, c) : OtherTexture(x, y, c);
  });
  constexpr std::size_t kSlots = 40;
  for (const bool verified : {true, false}) {
    TrackerParams params = With([](auto&) {});
    params.affine_verification = verified;
    Follower two(params, kSlots), one(params, kSlots);
    for (Follower* run : {&two, &one}) {
      for (std::size_t s = 0; s < kSlots; ++s) {
        run->from[s] = {4.0f + 4 * s, 64, s % 7 == 0 ? -1 : 1, 0};
      }
      run->tracker.InitialiseSeeds(first, run->from.data());
    }
    two.tracker.TrackFeatures(first, second, two.from.data(), two.to.data(), kSlots,
                              two.statistics);
    two.tracker.VerifyFeatures(second, two.to.data(), two.statistics);
    one.tracker.TrackAndVerify(first, second, one.from.data(), one.to.data(), kSlots,
                               one.statistics);
    for (std::size_t s = 0; s < kSlots; ++s) {
      EXPECT_EQ(one.to[s].status, two.to[s].status) << s;
      EXPECT_EQ(one.to[s].x, two.to[s].x);
      EXPECT_EQ(one.to[s].y, two.to[s].y);
      EXPECT_EQ(one.to[s].correlation, two.to[s].correlation);
    }
    EXPECT_EQ(one.statistics.translation, two.statistics.translation);
    EXPECT_EQ(one.statistics.verification, two.statistics.verification);
    EXPECT_GT(two.statistics.translation[0], 0u);
    EXPECT_GT(two.statistics.translation[1], 0u);
    EXPECT_EQ(two.statistics.verification[1] > 0, verified);
  }
}

TEST(VerificationTest, ColourModesThatVerifyNothing) {
  const ImagePyramid still = Frame(Texture);
  for (const int mode : {1, 3, 7}) {
    TrackerParams params = With([](auto&) {});
    params.color_correction_affine = mode;
    Follower run(params);
    run.Seed(still, 80, 64);
    EXPECT_EQ(run.Verify(still, 80, 64).status, feature_status::kRejectedCorrelation) << mode;
  }
}

}  // namespace
}  // namespace marrow::tracking
