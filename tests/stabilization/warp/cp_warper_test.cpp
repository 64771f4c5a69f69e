#include "stabilization/warp/cp_warper.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <utility>
#include <vector>

#include "tests/stabilization/warper_clips.h"

namespace marrow::stabilization {
namespace {

const matrix3 kHomography = {1.02, 0.03, 5, -0.01, 0.98, -7, 1e-5, -2e-5, 1};
const matrix3 kShift = {1, 0, 4, 0, 1, -3, 0, 0, 1};
// Targets are 32-bit floats at up to 2000 px.
constexpr double kFloat = 2e-4;

const auto under = [](const matrix3& m) { return [m](int, point2 p) { return transform(m, p); }; };
// No homography: a wave of 3 px.
const auto wavy = [](int, point2 p) {
  return point2{p.x + 3 * std::sin(p.y / 150), p.y + 3 * std::sin(p.x / 200)};
};

TEST(WarpGridTest, VerticesForUsualSizes) {
  const int sizes[][4] = {{720, 576, 53, 43},   {1920, 1080, 64, 36}, {3840, 2160, 64, 36},
                          {4096, 2160, 65, 35}, {1920, 1, 768, 3},    {1, 1920, 3, 768}};
  for (const auto& [width, height, cols, rows] : sizes) {
    const warp_grid grid(width, height);
    EXPECT_EQ(grid.cols, cols) << width << "x" << height;
    EXPECT_EQ(grid.rows, rows) << width << "x" << height;
  }
  const warp_grid hd(1920, 1080);
  EXPECT_NEAR(hd.cellWidth, 30.46031746, 1e-8);
  EXPECT_NEAR(hd.cellHeight, 30.82857143, 1e-8);
}

TEST(CPWarperTest, EachMethodMovesTheGridByItsOwnModel) {
  const matrix3 models[] = {kShift, similarity_matrix(1.02, .03, 9, -8), kHomography};
  for (const int k : {0, 1, 2}) {
    const auto warper = driven(clip_of(60, 2, under(models[k])), k + 1);
    EXPECT_LT(distance_from(*warper, 1, models[k]), k == 2 ? 10 * kFloat : kFloat);
    for (const std::int32_t q : quantise(*warper->frameWarp(1)).offsets) ASSERT_EQ(q, 0);
  }
}

// Where a frame's warp puts the place that a displacement has in its cell.
point2 warped_place(const CPWarper& warper, const Displacement& d) {
  point2 p = {0, 0};
  for (int k = 0; k < 4; ++k) {
    const point2 v = warper.frameWarp(1)->vertex(d.cellX + k % 2, d.cellY + k / 2);
    const double w = (k % 2 ? d.fracX : 1 - d.fracX) * (k / 2 ? d.fracY : 1 - d.fracY);
    p = {p.x + w * v.x, p.y + w * v.y};
  }
  return p;
}

TEST(CPWarperTest, TheSolvedGridFollowsAWaveFurtherThanTheHomographyButStaysStiff) {
  const auto global = clip_of(400, 2, wavy);
  double misfit[5] = {};  // by method
  for (const int method : {1, 2, 3, 4}) {
    const auto warper = driven(global, method);
    for (const Displacement& d : warper->displacements(1)) {
      const point2 p = warped_place(*warper, d);
      misfit[method] += std::pow(p.x - d.targetX, 2) + std::pow(p.y - d.targetY, 2);
      if (method < 4) expect_point_near(p, {d.sourceX, d.sourceY}, 1e-6);
    }
  }
  EXPECT_GT(misfit[3], 2 * 2 * 400);
  EXPECT_LT(misfit[4], .94 * misfit[3]);
  EXPECT_GT(misfit[4], .09 * misfit[3]);
}

TEST(CPWarperTest, WhereAHomographySufficesItIsTheFrame) {
  // Exact targets in 32-bit floats: whole numbers.
  const auto warper = driven(clip_of(60, 2, under(kShift)), 4);
  EXPECT_LT(distance_from(*warper, 1, kShift), 3e-4);
  for (const std::int32_t q : quantise(*warper->frameWarp(1)).offsets) ASSERT_EQ(q, 0);
}

// A quarter of the way from the simpler model: between 2 and 3 its matrix moves, between 3 and 4
// its grid.
TEST(CPWarperTest, AScoreBetweenTwoModelsBlendsThem) {
  const auto tilted = clip_of(60, 2, under(kHomography));
  auto warper = built(tilted, 2.25);
  const std::vector<Displacement> list = warper->displacements(1);
  const matrix3 s = fitSimilarity(list), h = fitHomography(list);
  matrix3 quarter;
  for (int i = 0; i < 9; ++i) quarter[i] = .75 * s[i] + .25 * h[i];
  warper->drive(kNoProgress);
  EXPECT_LT(distance_from(*warper, 1, quarter), 1e-8);
  EXPECT_GT(distance_from(*warper, 1, s), 1);

  const auto waving = clip_of(200, 2, wavy);
  const VarVector base = *driven(waving, 3)->frameWarp(1),
                  solved = *driven(waving, 4)->frameWarp(1);
  const VarVector blend = *driven(waving, 3.25)->frameWarp(1);
  double apart = 0;
  for (std::size_t i = 0; i < base.values.size(); ++i) {
    apart = std::max(apart, std::fabs(base.values[i] - solved.values[i]));
    ASSERT_NEAR(blend.values[i], .75 * base.values[i] + .25 * solved.values[i], 1.0 / 256);
  }
  EXPECT_GT(apart, 0.1);
  EXPECT_EQ(built(waving, 9)->modelScore(0), 4.0);  // there is none beyond
  // What is stored is what a saved project would give back.
  for (const VarVector& grid : {base, solved, blend}) {
    EXPECT_EQ(rebuild(quantise(grid), grid.cols, grid.rows).values, grid.values);
  }
}

TEST(CPWarperTest, TransitionFramesTakeTheirStoredMotion) {
  transition_record record;
  record.first = 3;
  record.end = 6;
  record.motion = {1, 0, 4, 5, 1.1, .1, 6, 7, 1, 0, 0, 0};
  const auto global = clip_of(60, 20, [&](int f, point2 p) {
    if (f < 3 || f >= 6) return transform(kHomography, p);
    const double* m = &record.motion[4 * (f - 3)];
    return transform(similarity_matrix(m[0], m[1], m[2], m[3]), p);
  });
  // Frame 5 is covered as well and stays a window's frame.
  const std::vector<factorization_window> windows = {window_over(0, 3), window_over(5, 20)};
  const auto shift = built(global, 1, windows, {record}),
             homography = built(global, 3, windows, {record});
  EXPECT_EQ(shift->modelScore(4), 1);
  EXPECT_EQ(homography->modelScore(4), 2);
  EXPECT_NEAR(homography->modelScore(5), 2 + 1.0 / 15, 1e-12);
  shift->drive(kNoProgress);
  homography->drive(kNoProgress);
  EXPECT_LT(distance_from(*shift, 4, {1, 0, 6, 0, 1, 7, 0, 0, 1}), 1e-9);
  EXPECT_LT(distance_from(*homography, 4, similarity_matrix(1.1, .1, 6, 7)), 1e-9);
}

TEST(CPWarperTest, StoredMotionThatMissesItsTargetsFailsTheSolve) {
  transition_record record;
  record.end = 2;
  record.motion = {1, 0, 0, 0, 1, 0, 0, 0.02};
  const auto global = clip_of(6, 2, under(identity3));
  EXPECT_THAT([&] { built(global, 4, {}, {record}); },
              testing::ThrowsMessage<std::runtime_error>(
                  "Homograph is not consistent with displacements on frame"));
  record.motion[7] = 0.008;
  EXPECT_EQ(built(global, 4, {}, {record})->modelScore(1), 2);
}

TEST(CPWarperTest, AWildHomographyIsLimitedToASimilarityFromSixTracksOn) {
  // All tracks on one line but one: the homography runs away.
  const auto scores = [](int tracks) {
    auto global = boost::make_shared<stabilizer_global>(empty_clip(tracks, 1));
    for (int s = 0; s < tracks; ++s) {
      add_still(*global, s, 0, 1, {100.0 + 37 * s * s, 500.0 + (s == 0 ? 1 : 0)},
                [&](int, point2 q) {
                  return point2{q.x + (s % 2 ? 40 : -40), q.y + 90 * (s % 3)};
                });
    }
    return built(global, 4)->modelScore(0);
  };
  EXPECT_EQ(scores(5), 4);
  EXPECT_EQ(scores(6), 2);
}

TEST(CPWarperTest, AFrameWhoseTracksDisagreeBecomesASimilarityAndItsNeighboursRampToIt) {
  // Corners moved to and fro along x in turn: the best similarity is the identity and leaves every
  // track `apart` away.
  const auto scores = [](double apart) {
    const auto global = rings_clip(120, [&](int f, point2 p) {
      const double to = f == 50 ? apart : 0;
      return point2{p.x + ((p.x > 960) == (p.y > 540) ? to : -to), p.y};
    });
    const auto warper = built(global, 4, {window_over(0, 120)}, {}, 1e9f);
    std::vector<double> found;
    for (const int f : {50, 51, 36, 35, 65, 20, 19}) found.push_back(warper->modelScore(f));
    return found;
  };
  // 0.15 of the frame's width is 288.
  EXPECT_EQ(scores(287), std::vector<double>(7, 4.0));
  EXPECT_THAT(scores(289),
              testing::Pointwise(testing::DoubleNear(1e-12),
                                 {2.0, 2 + 1.0 / 15, 2 + 14.0 / 15, 3.0, 3.0, 4.0, 4.0}));
}

TEST(CPWarperTest, AnOutlierWeighsItsTrackDownForSixtyFrames) {
  auto global = boost::make_shared<stabilizer_global>(empty_clip(20, 200));
  for (int s = 0; s < 20; ++s) {
    add_still(*global, s, 0, 200, scattered(s), [s](int f, point2 p) {
      return point2{p.x + 5 + (s == 7 && f == 100 ? 60 : 0), p.y};
    });
  }
  const auto warper = built(global, 4);
  const std::pair<int, double> expected[] = {{100, 0}, {99, 1 / 60.}, {70, .5}, {159, 59 / 60.}};
  for (const auto& [frame, weight] : expected) {
    EXPECT_NEAR(warper->displacements(frame)[7].weight, weight, 1e-12) << "frame " << frame;
    EXPECT_EQ(warper->displacements(frame)[8].weight, 1.0);
  }
}

// Its model is the least, and those of the frames before it rise from there, 15 for each step.
TEST(CPWarperTest, AFrameWithoutTracksHasNoPlace) {
  auto global = clip_of(60, 50, under(kShift));
  for (int s = 0; s < 60; ++s) {
    global->trajectories[s].last = 49;
    global->output_at(49, s).status = -1;
  }
  const auto warper = driven(global, 4);
  const std::pair<int, double> scores[] = {{49, 1}, {48, 1 + 1 / 15.}, {5, 1 + 44 / 15.}, {4, 4}};
  for (const auto& [frame, score] : scores) EXPECT_NEAR(warper->modelScore(frame), score, 1e-12);
  EXPECT_TRUE(std::isnan(warper->frameWarp(49)->values[0]));
  EXPECT_GT(warper->frameBounds(49).min_x, 1e38);
  EXPECT_LT(warper->frameBounds(49).max_x, 1e-37);
  EXPECT_TRUE(warper->boundsEmpty());
}

TEST(FrameBoundsTest, TheOuterRingsAndTheirUnion) {
  CPWarper warper(4, 91, 61);
  std::size_t stored = 0;
  const auto store = [&](point2 by, double inner = 0) {
    auto grid = boost::make_shared<VarVector>(grid_over(91, 61, 4, 3, [&](point2 p) {
      return point2{p.x + by.x, p.y + by.y};
    }));
    grid->values[10] += inner;
    warper.storeFrameWarp(grid, false);
    return warper.frameBounds(stored++);
  };
  EXPECT_THAT(store({5, -4}, 1000), testing::FieldsAre(5, -4, 95, 56));
  store({40, 20});
  EXPECT_THAT(warper.unionBounds(), testing::FieldsAre(5, -4, 130, 80));
  EXPECT_FALSE(warper.boundsEmpty());
  store({94.5, 0});
  EXPECT_TRUE(warper.boundsEmpty());
  EXPECT_EQ(store({-500, 0}).max_x, 1.1754943508222875e-38);  // maxima start there
  EXPECT_THROW(warper.frameBounds(4), std::out_of_range);
}

// The robust pass around a gap, as a solve in progress uses it.
TEST(CPWarperForWindowsTest, ProjectsTheFramesOwnMotionOverEveryLiveSource) {
  const matrix3 motion = similarity_matrix(1.05, .02, 30, -20);
  const auto global = clip_of(12, 80, under(motion));
  factorization_window window = window_over(0, 80);
  window.trajectory_flags.assign(12, 1);
  window.trajectory_flags[11] = 0;  // not a member: projected all the same
  CPWarper warper(80, kWidth, kHeight);
  warper.buildDisplacementsForWindows(*global, {window}, {});
  for (int f = 0; f < 80; ++f) global->output_at(f, 5).status = -1;  // dropped by the prune
  global->output_at(79, 3).x += 300;                                 // outlier
  warper.pruneDisplacements(79);
  EXPECT_EQ(warper.displacements(79).size(), 10u);
  EXPECT_EQ(warper.displacements(19).size(), 10u);
  EXPECT_EQ(warper.displacements(18).size(), 11u);
  warper.reweightRecent(79);
  EXPECT_EQ(warper.displacements(79)[3].weight, 0);
  EXPECT_NEAR(warper.displacements(78)[3].weight, 1.0 / 60, 1e-12);
  warper.projectFrame(79, false);
  for (int s = 0; s < 12; ++s) {
    expect_point_near(position(global->output_at(79, s)),
                      transform(motion, position(global->input_at(79, s))), 1e-3);
    EXPECT_EQ(global->output_at(79, s).status, 0);
  }

  for (int s = 0; s < 7; ++s) global->output_at(79, s).status = -1;
  warper.pruneDisplacements(79);
  EXPECT_THAT([&] { warper.projectFrame(79, true); },
              testing::ThrowsMessage<std::runtime_error>(
                  "Not enough features for computing similarity transform"));
}

}  // namespace
}  // namespace marrow::stabilization
