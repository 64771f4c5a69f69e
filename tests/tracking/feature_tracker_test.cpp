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

// A feature's way through a tracker, frame by frame.
struct Follower {
  explicit Follower(TrackerParams params = {}, std::size_t slots = 1)
      : tracker(params, slots, 3), from(slots), to(slots) {
    statistics.translation.resize(params.pyramidal_levels + 1);
    statistics.verification.resize(params.pyramidal_levels + 1);
  }
  void Seed(const ImagePyramid& frame, float x, float y) {
    from[0] = {x, y, 1, 0};
    tracker.InitialiseSeeds(frame, from.data());
  }
  // From (x, y) of the first frame into the second.
  Cell Follow(const ImagePyramid& first, const ImagePyramid& second, float x, float y) {
    from[0] = {x, y, 1, 0};
    to[0] = {};
    tracker.TrackAndVerify(first, second, from.data(), to.data(), 1, statistics);
    return to[0];
  }
  // What verification says of a seed that came to (x, y) of a frame.
  Cell Verify(const ImagePyramid& frame, float x, float y) { return Follow(frame, frame, x, y); }

  FeatureTracker tracker;
  std::vector<Cell> from, to;
  TrackingStatistics statistics;
};

void ExpectTracked(const Cell& cell, double x, double y) {
  EXPECT_EQ(cell.status, feature_status::kTracked);
  EXPECT_NEAR(cell.x, x, 0.05);
  EXPECT_NEAR(cell.y, y, 0.05);
}

TrackerParams With(void (*change)(TrackerParams&) = [](auto&) {}) {
  TrackerParams params;
  params.pyramidal_levels = 4;
  change(params);
  return params;
}
TrackerParams Unverified() {
  return With([](auto& p) { p.affine_verification = false; });
}

TEST(TranslationStageTest, SmallMotionIsFoundOnTheFinestLevelLargeOnACoarserOne) {
  const ImagePyramid still = Frame(Texture);
  Follower run(Unverified());
  ExpectTracked(run.Follow(still, Frame(Texture, 0.8, -0.6), 80, 64), 80.8, 63.4);
  EXPECT_THAT(run.statistics.translation, ElementsAre(0, 1, 0, 0, 0));

  // Further than the finest level reaches.
  for (const std::size_t levels : {4, 1}) {
    TrackerParams params = Unverified();
    params.half_win_x = 5;
    params.pyramidal_levels = levels;
    Follower far(params);
    const Cell cell = far.Follow(Frame(testing::Pattern, 0, 0, levels),
                                 Frame(testing::Pattern, 11, -6, levels), 80, 56);
    if (levels == 1) {
      EXPECT_EQ(cell.status, feature_status::kLost);
      EXPECT_THAT(far.statistics.translation, ElementsAre(1, 0));
      continue;
    }
    ExpectTracked(cell, 91, 50);
    EXPECT_THAT(far.statistics.translation, ElementsAre(0, 0, 1, 0, 0));
  }
}

TEST(TranslationStageTest, DeadCellsStayEmptyAndLiveOnesAreFollowed) {
  const ImagePyramid still = Frame(Texture);
  const std::int32_t before[] = {-1, -2, -3, -4, -10, -11, 0, 17};
  for (const bool verified : {false, true}) {
    Follower run(verified ? With() : Unverified(), 8);
    run.from.assign(8, {80, 64, 1, 0});
    run.tracker.InitialiseSeeds(still, run.from.data());
    for (int s = 0; s < 8; ++s) {
      run.from[s].status = before[s];
      run.to[s] = {-5, -6, 99, 0.25f};
    }
    run.tracker.TrackAndVerify(still, still, run.from.data(), run.to.data(), 8, run.statistics);
    for (int s = 0; s < 8; ++s) {
      const bool live = before[s] >= 0;
      EXPECT_EQ(run.to[s].status, live ? feature_status::kTracked : feature_status::kEmpty);
      EXPECT_NEAR(run.to[s].x, live ? 80 : -5, 1e-4);
      EXPECT_NEAR(run.to[s].y, live ? 64 : -6, 1e-4);
      EXPECT_NEAR(run.to[s].correlation, live && verified ? 1.0 : 0.25, 1e-4);
    }
    EXPECT_THAT(run.statistics.translation, ElementsAre(0, 2, 0, 0, 0));
    EXPECT_THAT(run.statistics.verification, ElementsAre(0, verified ? 2 : 0, 0, 0, 0));
  }
}

TEST(TranslationStageTest, LostFeaturesAreNotVerified) {
  const ImagePyramid still = Frame(Texture), flat = Frame(Flat);
  Follower run(With());
  const auto status = [&](const ImagePyramid& first, const ImagePyramid& second, float x, float y) {
    run.Seed(first, x, y);
    return run.Follow(first, second, x, y).status;
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
  EXPECT_THAT(run.statistics.translation, ElementsAre(8, 2, 0, 0, 0));
  EXPECT_THAT(run.statistics.verification, ElementsAre(0, 2, 0, 0, 0));
}

TEST(FeatureTrackerTest, ColourModesOfBothStages) {
  const ImagePyramid still = Frame(Texture);
  const ImagePyramid dim =
      Frame([](double x, double y, double c) { return (0.8 - 0.1 * c) * Texture(x, y, c) + 12; },
            0.6, -0.4);
  const struct {
    int translation, affine;
    std::int32_t status;
  } cases[] = {{2, 2, feature_status::kTracked},
               {3, 2, feature_status::kTracked},
               {1, 2, feature_status::kLost},
               {4, 2, feature_status::kLost},
               {-1, 2, feature_status::kLost},
               {2, 1, feature_status::kRejectedCorrelation},
               {2, 3, feature_status::kRejectedCorrelation},
               {2, 7, feature_status::kRejectedCorrelation}};
  for (const auto& c : cases) {
    TrackerParams params = With();
    params.color_correction_translation = c.translation;
    params.color_correction_affine = c.affine;
    Follower run(params);
    run.Seed(still, 80, 64);
    const Cell cell = run.Follow(still, dim, 80, 64);
    EXPECT_EQ(cell.status, c.status) << c.translation << c.affine;
    if (c.status == feature_status::kTracked) ExpectTracked(cell, 80.6, 63.6);
  }
}

// Two of three channels are black and flat, so that the correlation is a third at best.
double Red(double x, double y, double c) {
  return c == 0 ? Texture(x, y, c) : 1.0;
}

TEST(FeatureTrackerTest, ARedObjectSurvivesByItsMotionAlone) {
  const ImagePyramid first = Frame(Red), second = Frame(Red, 0.7, 0.4);
  for (const int mode : {0, 1, 2, 3, 9}) {  // without a say
    TrackerParams params = With();
    params.color_correction_translation = params.color_correction_affine = mode;
    Follower run(params);
    run.Seed(first, 80, 64);
    const Cell cell = run.Follow(first, second, 80, 64);
    SCOPED_TRACE(mode);
    ExpectTracked(cell, 80.7, 64.4);
    EXPECT_NEAR(cell.correlation, 1.0 / 3, 0.01);
  }
  Follower strict(With([](auto& p) { p.tolerance_primary_color_threshold = 0; }));
  EXPECT_EQ(strict.Follow(first, second, 80, 64).status, feature_status::kLost);
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
  Follower run(With());
  const ImagePyramid first = Turned(0, 1, 0, 1, 0);
  run.Seed(first, 80, 64);
  ImagePyramid before = first, last;
  for (int f = 1; f <= 20; ++f) {
    const double part = f / 20.0;
    last = Turned(1.4 * part, 1 + 0.2 * part, 0.4 * f, 1 - 0.4 * part, 20 * part);
    // The frame-to-frame stage hands over a place that is off.
    const Cell cell = run.Follow(before, last, 80 + 0.4f * (f - 1) + 0.3f, 64 - 0.3f);
    ASSERT_EQ(cell.status, feature_status::kTracked) << f;
    ASSERT_NEAR(cell.x, 80 + 0.4 * f, 0.1) << f;
    ASSERT_NEAR(cell.y, 64, 0.1) << f;
    ASSERT_GT(cell.correlation, 0.97f);
    before = last;
  }
  EXPECT_THAT(run.statistics.verification, ElementsAre(0, 20, 0, 0, 0));
  // A seed in the slot starts anew.
  run.Seed(first, 80, 64);
  EXPECT_EQ(run.Verify(last, 88, 64).status, feature_status::kRejectedCorrelation);
}

// A motion that is too large for the finest level from where the feature was.
TEST(VerificationTest, BeginsWhereTranslationLeftOff) {
  Follower run(With([](auto& p) { p.half_win_x = 5; }));
  const ImagePyramid first = Frame(testing::Pattern);
  run.Seed(first, 80, 56);
  ExpectTracked(run.Follow(first, Frame(testing::Pattern, 8, 16), 80, 56), 88, 72);
  EXPECT_THAT(run.statistics.verification, ElementsAre(0, 1, 0, 0, 0));
}

TEST(VerificationTest, RejectedAfterAFailedSearch) {
  const ImagePyramid still = Frame(Texture), other = Frame(OtherTexture), flat = Frame(Flat);
  Follower run(With());
  const auto status = [&](const ImagePyramid& seed, float seed_x, const ImagePyramid& now) {
    run.Seed(seed, seed_x, 64);
    const Cell cell = run.Verify(now, 80, 64);
    EXPECT_EQ(cell.correlation, 0.0f);
    EXPECT_EQ(cell.x, 80) << "a rejected place stays where translation saw it";
    return cell.status;
  };
  EXPECT_EQ(status(still, 80, other), feature_status::kRejectedCorrelation);
  EXPECT_EQ(status(flat, 80, still), feature_status::kRejectedCorrelation) << "singular";
  EXPECT_EQ(status(still, 4, still), feature_status::kRejectedCorrelation) << "no template";
  // The limit of a window with a dark channel is under the correlation that was never written.
  const ImagePyramid flat_red = Frame([](double, double, double c) { return c == 0 ? 90 : 1; });
  EXPECT_EQ(status(flat_red, 80, still), feature_status::kRejected);
  EXPECT_EQ(run.statistics.verification[0], 4u);
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

}  // namespace
}  // namespace marrow::tracking
