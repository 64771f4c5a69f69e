#include "stabilization/displacements.h"

#include <gtest/gtest.h>

#include <functional>

#include "tests/stabilization/clips.h"

namespace marrow::stabilization {
namespace {

const auto shifted = [](int, point2 p) { return point2{p.x + 10, p.y - 5}; };

// Of a slot: 100 pixels from its neighbours, moving by a pixel a frame.
void add_moving(stabilizer_global& global, int slot, int first, int last) {
  add_track(
      global, slot, first, last,
      [slot](int f) {
        return point2{100.0 * slot + f, 2.0 * f};
      },
      shifted);
}

// Each track has a record, linked to its neighbours and off its source by shift(frame), on exactly
// the frames where alive(frame, slot).
void expect_lists(const displacement_lists& lists, int slots,
                  const std::function<bool(int, int)>& alive,
                  const std::function<double(int)>& shift) {
  const int frames = static_cast<int>(lists.size());
  for (int f = 0; f < frames; ++f) {
    std::vector<int> records(slots);
    for (const Displacement& d : lists[f]) {
      const int slot = d.track->feature;
      ++records[slot];
      ASSERT_EQ(d.sourceX, 100.0 * slot + f);
      ASSERT_EQ(d.targetX, d.sourceX + shift(f));
      for (const auto& [other, index] : {std::pair(f + 1, d.nextIndex), {f - 1, d.prevIndex}}) {
        const bool there = other >= 0 && other < frames && alive(other, slot);
        ASSERT_EQ(index >= 0, there) << "frame " << f << " slot " << slot;
        if (there) {
          ASSERT_EQ(lists[other][index].track, d.track);
        }
      }
    }
    for (int s = 0; s < slots; ++s) ASSERT_EQ(records[s], alive(f, s)) << f << " slot " << s;
  }
}

TEST(BlendedDisplacementsTest, LinksFollowATrackThroughListsOfDifferentLength) {
  const int lives[][2] = {{0, 8}, {0, 20}, {6, 20}, {9, 13}, {10, 15}};  // the fourth is too short
  stabilizer_global global = empty_clip(5, 20);
  for (int s = 0; s < 5; ++s) add_moving(global, s, lives[s][0], lives[s][1]);
  expect_lists(
      blended_displacements(global, {}, {}), 5,
      [&](int f, int s) { return s != 3 && f >= lives[s][0] && f < lives[s][1]; },
      [](int) { return 10; });
}

TEST(BlendedDisplacementsTest, TracksAreCutToTheirStabilizedSamplesAndFadeFromTheCut) {
  stabilizer_global global = empty_clip(1, 100);
  add_moving(global, 0, 10, 90);
  for (const int f : {10, 11, 40}) global.output_at(f, 0).status = -1;
  const displacement_lists lists = blended_displacements(global, {}, {});
  expect_lists(
      lists, 1, [](int f, int) { return f >= 12 && f < 40; }, [](int) { return 10; });
  EXPECT_NEAR(lists[12][0].weight, 0.01, 1e-15);
  EXPECT_NEAR(lists[25][0].weight, 0.14, 1e-15);
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
  const factorization_window window = overlapping(global);
  global.output_at(60, 0).status = -1;  // held by the old solution alone
  const displacement_lists lists = blended_displacements(global, {window}, {});
  const double expected[][2] = {{0, .967742}, {1, .935484}, {15, .483871}, {29, .032258}};
  for (const auto& [f, t] : expected) {
    EXPECT_NEAR(lists[40 + static_cast<int>(f)][0].targetX, 10 + 8 * t, 1e-5);
    EXPECT_EQ(lists[40 + static_cast<int>(f)][0].weight, .5);  // as its span is as long as a flank
  }
  EXPECT_EQ(lists[39][0].targetX, 10);
  EXPECT_EQ(lists[70][0].targetX, 10);
  EXPECT_EQ(lists[60][0].targetX, 18);
  EXPECT_NEAR(lists[60][0].weight, .5 * 10 / 31, 1e-12);
}

TEST(BlendedDisplacementsTest, InsideAnOverlapTheWindowsTableSaysWhoLives) {
  stabilizer_global global = empty_clip(2, 100);
  add_moving(global, 0, 0, 100);
  add_moving(global, 1, 50, 100);
  factorization_window window = overlapping(global);
  window.overlap_rows[20 * 2 + 0].status = -1;  // frame 60 of the first track
  window.overlap_rows[10 * 2 + 1].status = -1;  // the second one's first frame
  const displacement_lists lists = blended_displacements(global, {window}, {});
  for (int f = 0; f < 100; ++f) ASSERT_EQ(lists[f].size(), f < 60) << f;
}

TEST(MemberDisplacementsTest, TracksRunAsLongAsTheirWindowsListThem) {
  stabilizer_global global = empty_clip(3, 120);
  for (int s = 0; s < 3; ++s) add_moving(global, s, 0, 120);
  for (track_sample& sample : global.output) sample.status = -1;  // nothing solved yet
  std::vector<factorization_window> windows(2);
  windows[0].first = 10;
  windows[0].end = 60;
  windows[0].trajectory_flags = {1, 1};
  windows[1].first = 50;
  windows[1].end = 100;
  windows[1].trajectories_begin = 1;
  windows[1].trajectory_flags = {1, 1};
  expect_lists(
      member_displacements(global, windows, {}), 3,
      [](int f, int s) { return f >= (s == 2 ? 50 : 10) && f < (s == 0 ? 50 : 100); },
      [](int) { return 10; });
}

TEST(RefreshTargetsTest, DroppedRecordsLeaveAllLinksRight) {
  stabilizer_global global = empty_clip(4, 30);
  for (int s = 0; s < 4; ++s) add_moving(global, s, 0, 30);
  displacement_lists lists = blended_displacements(global, {}, {});
  for (track_sample& sample : global.output) sample.x += 1;
  // Beside the range, on its first frame, inside it, and on its last.
  for (const auto& [f, s] : {std::pair(9, 3), {10, 0}, {15, 1}, {15, 2}, {19, 0}}) {
    global.output_at(f, s).status = -1;
  }
  refresh_targets(lists, global, 10, 20);
  const auto inside = [](int f) { return f >= 10 && f < 20; };
  expect_lists(
      lists, 4, [&](int f, int s) { return !inside(f) || global.output_at(f, s).status >= 0; },
      [&](int f) { return inside(f) ? 11 : 10; });
}

}  // namespace
}  // namespace marrow::stabilization
