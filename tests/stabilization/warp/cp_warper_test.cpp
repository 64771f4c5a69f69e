#include "stabilization/warp/cp_warper.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <utility>
#include <vector>

#include "tests/stabilization/clips.h"

namespace marrow::stabilization {
namespace {

const matrix3 kHomography = {1.02, 0.03, 5, -0.01, 0.98, -7, 1e-5, -2e-5, 1};
const matrix3 kShift = {1, 0, 4, 0, 1, -3, 0, 0, 1};
// Targets are 32-bit floats at up to 2000 px.
constexpr double kFloat = 2e-4;

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
}

TEST(CPWarperTest, EachMethodMovesTheGridByItsOwnModel) {
  const struct {
    float method;
    matrix3 model;
    double tolerance;
  } cases[] = {{1, kShift, kFloat},
               {2, similarity_matrix(1.02, .03, 9, -8), kFloat},
               {3, kHomography, 10 * kFloat},
               // Where a homography suffices, to whole numbers here, it is the frame.
               {4, kShift, 3e-4}};
  for (const auto& e : cases) {
    const auto warper = driven(still_clip(60, 2, under(e.model)), e.method);
    EXPECT_LT(distance_from(*warper, 1, e.model), e.tolerance) << e.method;
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

// The solved grid follows a wave further than the homography, but stays stiff. What is a quarter of
// the way to it is blended of the two.
TEST(CPWarperTest, BetweenAHomographyAndTheSolvedGrid) {
  const auto waving = still_clip(400, 2, wavy);
  const auto base = driven(waving, 3), solved = driven(waving, 4), blend = driven(waving, 3.25);
  double base_misfit = 0, solved_misfit = 0;
  const std::vector<Displacement> on_base = base->displacements(1);
  const std::vector<Displacement> on_solved = solved->displacements(1);
  for (int s = 0; s < 400; ++s) {
    const Displacement& d = on_base[s];
    const point2 p = warped_place(*base, d), q = warped_place(*solved, on_solved[s]);
    expect_point_near(p, {d.sourceX, d.sourceY}, 1e-6);
    base_misfit += std::pow(p.x - d.targetX, 2) + std::pow(p.y - d.targetY, 2);
    solved_misfit += std::pow(q.x - d.targetX, 2) + std::pow(q.y - d.targetY, 2);
  }
  EXPECT_GT(base_misfit, 2 * 2 * 400);
  EXPECT_LT(solved_misfit, .94 * base_misfit);
  EXPECT_GT(solved_misfit, .09 * base_misfit);

  const std::vector<double> a = base->frameWarp(1)->values, b = solved->frameWarp(1)->values;
  const VarVector grid = *blend->frameWarp(1);
  for (std::size_t i = 0; i < a.size(); ++i) {
    ASSERT_NEAR(grid.values[i], .75 * a[i] + .25 * b[i], 1.0 / 256);
  }
  // What is stored is what a saved project would give back.
  EXPECT_EQ(rebuild(quantise(grid), grid.cols, grid.rows).values, grid.values);
  EXPECT_EQ(built(waving, 9)->modelScore(0), 4.0);  // there is no model beyond
}

TEST(CPWarperTest, BetweenASimilarityAndAHomographyTheMatrixMoves) {
  const auto warper = built(still_clip(60, 2, under(kHomography)), 2.25);
  const std::vector<Displacement>& list = warper->displacements(1);
  const matrix3 s = fitSimilarity(list), h = fitHomography(list);
  matrix3 quarter;
  for (int i = 0; i < 9; ++i) quarter[i] = .75 * s[i] + .25 * h[i];
  warper->drive(kNoProgress);
  EXPECT_LT(distance_from(*warper, 1, quarter), 1e-8);
  EXPECT_GT(distance_from(*warper, 1, s), 1);
}

TEST(CPWarperTest, TransitionFramesTakeTheirStoredMotion) {
  transition_record record;
  record.first = 3;
  record.end = 6;
  record.motion = {1, 0, 4, 5, 1.1, .1, 6, 7, 1, 0, 0, 0};
  const auto global = still_clip(60, 20, [&](int f, point2 p) {
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
  // What the motion does to the middle, (959.5, 539.5).
  EXPECT_LT(distance_from(*shift, 4, {1, 0, 37.431005, 0, 1, 163.354401, 0, 0, 1}), 1e-5);
  EXPECT_LT(distance_from(*homography, 4, similarity_matrix(1.1, .1, 6, 7)), 1e-9);
}

TEST(CPWarperTest, StoredMotionThatMissesItsTargetsFailsTheSolve) {
  transition_record record;
  record.end = 2;
  record.motion = {1, 0, 0, 0, 1, 0, 0, 0.02};
  const auto global = still_clip(6, 2, under(identity3));
  EXPECT_THAT([&] { built(global, 4, {}, {record}); },
              testing::ThrowsMessage<std::runtime_error>(
                  "Homograph is not consistent with displacements on frame"));
  record.motion[7] = 0.008;
  EXPECT_EQ(built(global, 4, {}, {record})->modelScore(1), 2);
}

TEST(CPWarperTest, AWildHomographyIsLimitedToASimilarityFromSixTracksOn) {
  // All tracks on one line but one, each wanted off its place by its own: the homography runs away.
  const auto scores = [](int tracks) {
    const auto global = still_clip(tracks, 1, under(identity3), [](std::size_t s) {
      return point2{100.0 + 37.0 * s * s, s == 0 ? 501.0 : 500.0};
    });
    for (int s = 0; s < tracks; ++s) {
      global->output[s].x += s % 2 ? 40 : -40;
      global->output[s].y += 90 * (s % 3);
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
    const auto wanted = [apart](int f, point2 p) {
      const double to = f == 50 ? apart : 0;
      return point2{p.x + ((p.x > 960) == (p.y > 540) ? to : -to), p.y};
    };
    const auto global = still_clip(8, 120, wanted, on_rings);
    const auto warper = built(global, 4, {}, {}, 1e9f);
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
  const auto global = still_clip(20, 200, under(kShift));
  global->output_at(100, 7).x += 60;
  const auto warper = built(global, 4);
  const std::pair<int, double> expected[] = {{100, 0}, {99, 1 / 60.}, {70, .5}, {159, 59 / 60.}};
  for (const auto& [frame, weight] : expected) {
    EXPECT_NEAR(warper->displacements(frame)[7].weight, weight, 1e-12) << "frame " << frame;
    EXPECT_EQ(warper->displacements(frame)[8].weight, 1.0);
  }
}

// Its model is the least, and those of the frames before it rise from there, 15 for each step.
TEST(CPWarperTest, AFrameWithoutTracksHasNoPlace) {
  const auto global = still_clip(60, 50, under(kShift));
  for (Trajectory& t : global->trajectories) t.last = 49;
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
    warper.storeFrameWarp(*grid);
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
  const auto global = still_clip(12, 80, under(motion));
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
