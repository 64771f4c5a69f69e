#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <optional>
#include <vector>

#include "synthetic/drawn_frames.h"
#include "tracking/tracking_run.h"

// The whole tracking loop on frames of a known world: where its tracks are, beside where they
// should be.
namespace marrow::tracking {
namespace {

using synthetic::point2;

constexpr int kHalfWindow = 7;

struct tracked_scene {
  explicit tracked_scene(const synthetic::scene_options& options)
      : world(synthetic::street(1), synthetic::handheld_path({}), options) {
    SelectorParams selector;
    selector.max_count = 120;
    selector.spacing = 12;
    selector.half_winx = selector.half_winy = kHalfWindow;
    selector.threshold = 0.01f;
    TrackerParams tracker;
    tracker.half_win_x = kHalfWindow;
    tracker.kill_tracks_shorter_than = 5;
    synthetic::scene_frame_source source(world);
    TrackFrames(source, selector, tracker, table);
    tracks = BuildTrajectories(table.features->data(), table.feature_count, table.frame_count);
  }

  const tracking_feature<float>& cell(int frame, int slot) const {
    return (*table.features)[frame * table.feature_count + slot];
  }
  point2 seed(const Trajectory& track) const {
    const auto& first = cell(track.first, track.feature);
    return {first.x, first.y};
  }
  double error(const Trajectory& track, int frame, point2 right) const {
    const auto& found = cell(frame, track.feature);
    return std::hypot(found.x - right.x, found.y - right.y);
  }
  // Whether the first window shows one thing, so that there is one place to be followed.
  bool on_one_surface(const Trajectory& track) const {
    const point2 p = seed(track);
    double nearest = 1e30, farthest = 0;
    for (int y = -kHalfWindow - 1; y <= kHalfWindow + 1; y += 4) {
      for (int x = -kHalfWindow - 1; x <= kHalfWindow + 1; x += 4) {
        const double depth = world.depth(track.first, {p.x + x, p.y + y}).value_or(1e30);
        nearest = std::min(nearest, depth);
        farthest = std::max(farthest, depth);
      }
    }
    return farthest < 1.15 * nearest && world.locate(track.first, p, track.first);
  }
  int alive(int frame) const {
    int count = 0;
    for (int s = 0; s < table.feature_count; ++s) count += cell(frame, s).status >= 0;
    return count;
  }

  synthetic::scene world;
  AllFeatures table;
  std::vector<Trajectory> tracks;
};

TEST(TrackedSceneTest, TracksStayOnTheirPlacesThoughEachFrameHasItsOwnLight) {
  const tracked_scene scene(
      {.width = 360, .height = 203, .frame_count = 100, .noise = 1, .gain = 0.15, .bias = 8});
  std::vector<double> errors, late;  // late: of the second half of a long track
  for (const Trajectory& track : scene.tracks) {
    if (!scene.on_one_surface(track)) continue;
    for (int f = track.first + 1; f < track.last; ++f) {
      if (f % 3 != 0) continue;
      const auto right = scene.world.locate(track.first, scene.seed(track), f);
      if (!right) continue;
      errors.push_back(scene.error(track, f, *right));
      if (f > track.first + 30) late.push_back(errors.back());
    }
  }
  std::sort(errors.begin(), errors.end());
  std::sort(late.begin(), late.end());
  ASSERT_GT(errors.size(), 500u);
  ASSERT_GT(late.size(), 100u);
  EXPECT_LT(errors[errors.size() / 2], 0.1);
  EXPECT_LT(errors[errors.size() * 9 / 10], 0.5);
  EXPECT_LT(errors[errors.size() * 99 / 100], 3.0);
  EXPECT_LT(late[late.size() / 2], 0.15) << "errors add up";
  for (int f = 0; f < 100; ++f) ASSERT_GT(scene.alive(f), 80) << f;
}

TEST(TrackedSceneTest, TracksEndAtABoardThatCrossesTheViewAndNewOnesStartBehindIt) {
  synthetic::scene_options options = {
      .width = 320, .height = 180, .frame_count = 60, .noise = 1, .occluder = true};
  const tracked_scene scene(options);
  options.occluder = false;
  const synthetic::scene clear(synthetic::street(1), synthetic::handheld_path({}), options);

  // Whether a window holds a part of the board.
  const auto shows_board = [&](int frame, point2 p) {
    for (const double dy : {-kHalfWindow - 2, 0, kHalfWindow + 2}) {
      for (const double dx : {-kHalfWindow - 2, 0, kHalfWindow + 2}) {
        const point2 q = {p.x + dx, p.y + dy};
        if (scene.world.depth(frame, q) != clear.depth(frame, q)) return true;
      }
    }
    return false;
  };
  int covered = 0, ended = 0, dragged = 0, after = 0, uncovered = 0, jumps = 0;
  for (const Trajectory& track : scene.tracks) {
    const point2 seed = scene.seed(track);
    if (shows_board(track.first, seed)) continue;
    const auto hidden = [&](int f) {
      return clear.locate(track.first, seed, f) && !scene.world.locate(track.first, seed, f);
    };
    int hidden_for = 0;
    for (int f = track.first + 1; f < track.last; ++f) {
      const auto right = scene.world.locate(track.first, seed, f);
      if (!right) {
        hidden_for += hidden(f);
        continue;
      }
      after += hidden_for > 2;
      const double error = scene.error(track, f, *right);
      jumps += error > 5 && scene.on_one_surface(track);
    }
    if (hidden_for > 0 || (track.last < 60 && hidden(track.last))) {
      ++covered;
      ended += track.last < 60;
      dragged += hidden_for > 3;
    }
    // Seeded where the board was not long ago.
    bool was_hidden = false;
    for (int f = std::max(track.first - 12, 0); f < track.first; ++f) was_hidden |= hidden(f);
    uncovered += was_hidden;
  }
  EXPECT_GE(covered, 12);
  EXPECT_EQ(ended, covered);
  EXPECT_EQ(dragged, 0) << "tracks that go on behind the board";
  EXPECT_EQ(after, 0) << "tracks that come out from behind the board";
  EXPECT_EQ(jumps, 0);
  EXPECT_GE(uncovered, 4) << "found anew";
  // The board hides a part of the view in between; at the end the slots are full again.
  EXPECT_GT(scene.alive(59), 0.9 * scene.alive(0));
}

}  // namespace
}  // namespace marrow::tracking
