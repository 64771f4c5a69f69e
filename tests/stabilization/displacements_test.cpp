#include "stabilization/displacements.h"

#include <gtest/gtest.h>

#include "tests/stabilization/displacement_lists.h"

namespace marrow::stabilization {
namespace {

const auto at_slot = [](double x) { return [x](int f) { return point2{x + f, 2.0 * f}; }; };
const auto shifted = [](int, point2 p) { return point2{p.x + 10, p.y - 5}; };

std::vector<double> weights_of(int first, int last, int frames) {
  stabilizer_global global = empty_clip(1, frames);
  add_track(global, 0, first, last, at_slot(3), shifted);
  std::vector<double> weights;
  for (const auto& list : blended_displacements(global, {}, {})) {
    for (const Displacement& d : list) weights.push_back(d.weight);
  }
  return weights;
}

TEST(BlendedDisplacementsTest, WeightsOfWholeAndPassingTracks) {
  EXPECT_EQ(weights_of(0, 300, 300), std::vector<double>(300, 1.0));
  EXPECT_EQ(weights_of(0, 150, 150), std::vector<double>(150, 0.75));
  const std::vector<double> passing = weights_of(10, 15, 300);
  ASSERT_EQ(passing.size(), 5u);
  const double expected[] = {.01, .02, .025, .02, .01};
  for (int i = 0; i < 5; ++i) EXPECT_NEAR(passing[i], expected[i], 1e-15);
  EXPECT_TRUE(weights_of(10, 14, 300).empty());
}

TEST(BlendedDisplacementsTest, LinksFollowATrackThroughListsOfDifferentLength) {
  stabilizer_global global = empty_clip(3, 20);
  add_track(global, 0, 0, 8, at_slot(0), shifted);
  add_track(global, 1, 0, 20, at_slot(100), shifted);
  add_track(global, 2, 6, 20, at_slot(200), shifted);
  const displacement_lists lists = blended_displacements(global, {}, {});
  for (int f = 0; f < 20; ++f) {
    for (const Displacement& d : lists[f]) {
      ASSERT_EQ(d.sourceX, d.track->feature * 100.0 + f);
      ASSERT_EQ(d.targetX, d.sourceX + 10);
      ASSERT_EQ(d.nextIndex < 0, f + 1 == d.track->last);
      ASSERT_EQ(d.prevIndex < 0, f == d.track->first);
      if (d.nextIndex >= 0) {
        ASSERT_EQ(lists[f + 1][d.nextIndex].track, d.track);
      }
      if (d.prevIndex >= 0) {
        ASSERT_EQ(lists[f - 1][d.prevIndex].track, d.track);
      }
    }
  }
}

TEST(BlendedDisplacementsTest, TracksAreCutToTheirStabilizedSamples) {
  stabilizer_global global = empty_clip(1, 100);
  add_track(global, 0, 10, 90, at_slot(0), shifted);
  for (const int f : {10, 11, 40}) global.output_at(f, 0).status = -1;
  const displacement_lists lists = blended_displacements(global, {}, {});
  for (int f = 0; f < 100; ++f) ASSERT_EQ(lists[f].size(), f >= 12 && f < 40 ? 1u : 0u) << f;
  EXPECT_NEAR(lists[12][0].weight, 0.01, 1e-15);  // fades from the cut
  EXPECT_EQ(lists[39][0].nextIndex, -1);
}

// Window [40, 100) whose first 30 frames had been solved before, 8 pixels to the right.
factorization_window overlapping(const stabilizer_global& global) {
  factorization_window window;
  window.first = 40;
  window.end = 100;
  window.overlap_end = 70;
  window.overlap_rows.assign(global.output.begin() + 40 * global.feature_count,
                             global.output.begin() + 70 * global.feature_count);
  for (track_sample& s : window.overlap_rows) s.x += 8;
  return window;
}

TEST(BlendedDisplacementsTest, AWindowsStartMovesFromTheOldSolutionToTheNew) {
  stabilizer_global global = empty_clip(1, 100);
  add_track(
      global, 0, 0, 100,
      [](int) {
        return point2{0, 0};
      },
      shifted);
  const displacement_lists lists = blended_displacements(global, {overlapping(global)}, {});
  const double expected[][2] = {{0, .967742}, {1, .935484}, {15, .483871}, {29, .032258}};
  for (const auto& [f, t] : expected) {
    EXPECT_NEAR(lists[40 + static_cast<int>(f)][0].targetX, 10 + 8 * t, 1e-5);
  }
  EXPECT_EQ(lists[39][0].targetX, 10);
  EXPECT_EQ(lists[70][0].targetX, 10);
}

TEST(BlendedDisplacementsTest, InsideAnOverlapTheWindowsTableSaysWhoLives) {
  stabilizer_global global = empty_clip(2, 100);
  add_track(global, 0, 0, 100, at_slot(0), shifted);
  add_track(global, 1, 50, 100, at_slot(100), shifted);
  factorization_window window = overlapping(global);
  window.overlap_rows[20 * 2 + 0].status = -1;  // frame 60 of the first track
  window.overlap_rows[10 * 2 + 1].status = -1;  // the second one's first frame
  const displacement_lists lists = blended_displacements(global, {window}, {});
  EXPECT_EQ(lists[59].size(), 1u);
  for (int f = 60; f < 100; ++f) ASSERT_TRUE(lists[f].empty()) << f;
}

TEST(MemberDisplacementsTest, TracksRunAsLongAsTheirWindowsListThem) {
  stabilizer_global global = empty_clip(3, 120);
  for (int s = 0; s < 3; ++s) add_track(global, s, 0, 120, at_slot(100 * s), shifted);
  for (track_sample& sample : global.output) sample.status = -1;  // nothing solved yet
  std::vector<factorization_window> windows(2);
  windows[0].first = 10;
  windows[0].end = 60;
  windows[0].trajectory_flags = {1, 1};
  windows[1].first = 50;
  windows[1].end = 100;
  windows[1].trajectories_begin = 1;
  windows[1].trajectory_flags = {1, 1};
  const displacement_lists lists = member_displacements(global, windows, {});
  const auto alive = [&](int f, int slot) {
    for (const Displacement& d : lists[f]) {
      if (d.track->feature == slot) return true;
    }
    return false;
  };
  for (int f = 0; f < 120; ++f) {
    ASSERT_EQ(alive(f, 0), f >= 10 && f < 50) << f;
    ASSERT_EQ(alive(f, 1), f >= 10 && f < 100) << f;
    ASSERT_EQ(alive(f, 2), f >= 50 && f < 100) << f;
  }
}

TEST(RefreshTargetsTest, DroppedRecordsLeaveAllLinksRight) {
  stabilizer_global global = empty_clip(4, 30);
  for (int s = 0; s < 4; ++s) add_track(global, s, 0, 30, at_slot(100 * s), shifted);
  displacement_lists lists = blended_displacements(global, {}, {});
  for (track_sample& sample : global.output) sample.x += 1;
  global.output_at(9, 3).status = -1;   // beside the range
  global.output_at(10, 0).status = -1;  // the range's first frame
  global.output_at(15, 1).status = -1;
  global.output_at(15, 2).status = -1;
  global.output_at(19, 0).status = -1;  // and its last
  refresh_targets(lists, global, 10, 20);
  EXPECT_EQ(lists[9].size(), 4u);
  EXPECT_EQ(lists[10].size(), 3u);
  EXPECT_EQ(lists[15].size(), 2u);
  for (int f = 0; f < 30; ++f) {
    for (const Displacement& d : lists[f]) {
      ASSERT_EQ(d.targetX, d.sourceX + (f >= 10 && f < 20 ? 11 : 10)) << f;
      const auto dead = [&](int g) {
        return g >= 10 && g < 20 && global.output_at(g, d.track->feature).status < 0;
      };
      ASSERT_EQ(d.nextIndex < 0, f == 29 || dead(f + 1)) << f << " " << d.track->feature;
      ASSERT_EQ(d.prevIndex < 0, f == 0 || dead(f - 1)) << f << " " << d.track->feature;
      if (d.nextIndex >= 0) {
        ASSERT_EQ(lists[f + 1][d.nextIndex].track, d.track);
      }
      if (d.prevIndex >= 0) {
        ASSERT_EQ(lists[f - 1][d.prevIndex].track, d.track);
      }
    }
  }
}

}  // namespace
}  // namespace marrow::stabilization
