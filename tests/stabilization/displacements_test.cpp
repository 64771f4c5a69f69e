#include "stabilization/displacements.h"

#include <gtest/gtest.h>

#include <functional>

#include "stabilization/fade_weight.h"
#include "tests/stabilization/clips.h"

namespace marrow::stabilization {
namespace {

// Tracks over [first, last) of a clip, in flanks of 100 frames, those under 5 frames dropped.
TEST(FadeWeight, TracksRiseAndFallUnlessTheClipCutsThem) {
  const struct {
    int first, last, frames;
    std::vector<std::pair<int, double>> weights;  // of frames
  } tracks[] = {
      {0, 300, 300, {{0, 1}, {150, 1}, {299, 1}}},
      {0, 150, 150, {{0, .75}, {149, .75}}},
      {0, 99, 300, {{0, .99}, {50, .49}, {98, .01}}},
      {0, 100, 300, {{0, .5}, {49, .5}, {50, .5}, {51, .49}, {99, .01}}},
      {0, 101, 300, {{0, .505}, {50, .505}, {100, .01}}},
      {250, 300, 300, {{250, .01}, {274, .25}, {299, .5}}},
      {10, 15, 300, {{10, .01}, {11, .02}, {12, .025}, {13, .02}, {14, .01}}},
      {10, 16, 300, {{10, .01}, {12, .03}, {13, .03}, {15, .01}}},
      {10, 14, 300, {{10, 0}, {12, 0}}},
      {50, 350, 1000, {{50, .01}, {148, .99}, {149, 1}, {250, 1}, {251, .99}, {349, .01}}}};
  for (const auto& t : tracks) {
    for (const auto& [frame, weight] : t.weights) {
      EXPECT_NEAR(fade_weight(t.first, t.last, t.frames, frame, 100, 5), weight, 1e-12)
          << t.first << " to " << t.last << ", frame " << frame;
    }
  }
  EXPECT_EQ(fade_weight({7, false, false}, 3, 0), 1.0);  // no flanks
}

// Tracks 100 pixels from each other that move by a pixel a frame, stabilized 10 to the right.
stabilizer_global moving_clip(int frames, const std::vector<lives>& tracks) {
  stabilizer_global global = clip_of(frames, tracks, [](std::size_t slot, int f) {
    return point2{100.0 * slot + f, 2.0 * f};
  });
  global.output = global.input;
  for (track_sample& sample : global.output) sample.x += 10;
  return global;
}

// Each track has a record, linked to its neighbours and off its source by shift(frame), on exactly
// the frames where alive(frame, slot).
void expect_lists(
    const displacement_lists& lists, int slots, const std::function<bool(int, int)>& alive,
    const std::function<double(int)>& shift = [](int) { return 10; }) {
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
  const std::vector<lives> tracks = {// the fourth is too short
                                     {1, 0, 8},
                                     {1, 0, 20},
                                     {1, 6, 20},
                                     {1, 9, 13},
                                     {1, 10, 15}};
  expect_lists(blended_displacements(moving_clip(20, tracks), {}, {}), 5,
               [&](int f, int s) { return s != 3 && f >= tracks[s].first && f < tracks[s].end; });
}

TEST(BlendedDisplacementsTest, TracksAreCutToTheirStabilizedSamplesAndFadeFromTheCut) {
  stabilizer_global global = moving_clip(100, {{1, 10, 90}});
  for (const int f : {10, 11, 40}) global.output_at(f, 0).status = -1;
  const displacement_lists lists = blended_displacements(global, {}, {});
  expect_lists(lists, 1, [](int f, int) { return f >= 12 && f < 40; });
  EXPECT_NEAR(lists[12][0].weight, 0.01, 1e-15);
  EXPECT_NEAR(lists[25][0].weight, 0.14, 1e-15);
}

// Window [40, 100) whose first 30 frames had been solved before, 8 pixels to the right.
factorization_window overlapping(const stabilizer_global& global) {
  factorization_window window = window_over(40, 100);
  window.overlap_end = 70;
  window.overlap_rows.assign(global.output.begin() + 40 * global.feature_count,
                             global.output.begin() + 70 * global.feature_count);
  for (track_sample& s : window.overlap_rows) s.x += 8;
  return window;
}

TEST(BlendedDisplacementsTest, AWindowsStartMovesFromTheOldSolutionToTheNew) {
  stabilizer_global global = moving_clip(100, {{1, 0, 100}});
  const factorization_window window = overlapping(global);
  global.output_at(60, 0).status = -1;  // held by the old solution alone
  const displacement_lists lists = blended_displacements(global, {window}, {});
  const auto shift = [&](int f) { return lists[f][0].targetX - lists[f][0].sourceX; };
  for (const auto& [f, t] : {std::pair(40, .967742), {55, .483871}, {69, .032258}}) {
    EXPECT_NEAR(shift(f), 10 + 8 * t, 1e-5);
    EXPECT_EQ(lists[f][0].weight, .5);  // as its span is as long as a flank
  }
  EXPECT_EQ(shift(39), 10);
  EXPECT_EQ(shift(70), 10);
  EXPECT_EQ(shift(60), 18);
  EXPECT_NEAR(lists[60][0].weight, .5 * 10 / 31, 1e-12);
}

TEST(BlendedDisplacementsTest, InsideAnOverlapTheWindowsTableSaysWhoLives) {
  const stabilizer_global global = moving_clip(100, {{1, 0, 100}, {1, 50, 100}});
  factorization_window window = overlapping(global);
  window.overlap_rows[20 * 2 + 0].status = -1;  // frame 60 of the first track
  window.overlap_rows[10 * 2 + 1].status = -1;  // the second one's first frame
  const displacement_lists lists = blended_displacements(global, {window}, {});
  for (int f = 0; f < 100; ++f) ASSERT_EQ(lists[f].size(), f < 60) << f;
}

// The first track's runs are in the windows 0 and 2, behind a gap; the others' go on up to 100.
TEST(MemberDisplacementsTest, TracksRunWhereTheirWindowsListThem) {
  stabilizer_global global = moving_clip(140, {{3, 0, 140}});
  for (track_sample& sample : global.output) sample.status = -1;  // nothing solved yet
  std::vector<factorization_window> windows = {window_over(10, 60), window_over(50, 100),
                                               window_over(110, 130)};
  windows[0].trajectory_flags = windows[1].trajectory_flags = {1, 1};
  windows[1].trajectories_begin = 1;
  windows[2].trajectory_flags = {1};
  const displacement_lists lists = member_displacements(global, windows, {});
  expect_lists(lists, 3, [](int f, int s) {
    return (f >= (s == 2 ? 50 : 10) && f < (s == 0 ? 50 : 100)) || (s == 0 && f >= 110 && f < 130);
  });
  // A run of 20 frames peaks at 20 / 200.
  for (const auto& [f, weight] : {std::pair(110, .01), {119, .1}, {129, .01}}) {
    ASSERT_EQ(lists[f].size(), 1u);
    EXPECT_NEAR(lists[f][0].weight, weight, 1e-15);
  }
}

TEST(RefreshTargetsTest, DroppedRecordsLeaveAllLinksRight) {
  stabilizer_global global = moving_clip(30, {{4, 0, 30}});
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
