#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <cmath>
#include <string>
#include <vector>

#include "stabilization/warp/cp_warper.h"
#include "tests/stabilization/solve_clips.h"

// Clips with little or nothing to go by.
namespace marrow::stabilization {
namespace {

stabilizer_global shaken(int frames, int slots, int first, int end, int slot_begin = 0) {
  stabilizer_global global = empty_table(frames, slots);
  for (int s = slot_begin; s < slots; ++s) {
    put_track(global, s, first, end, [&](int f) {
      return point2{scattered(s).x + 8 * std::sin(1.7 * f), scattered(s).y + 6 * std::cos(2.9 * f)};
    });
  }
  return global;
}

TEST(StabilizerMainDegenerate, StillPictureComesOutExact) {
  synthetic::track_world_options options;
  options.frame_count = 100;
  options.slots = 200;
  options.scene = synthetic::track_scene::still;
  options.noise = 0;
  options.whole_clip = true;
  const solved_clip clip = solve(make_track_world(options), params_1080p());
  ASSERT_EQ(clip.result, 1);
  ASSERT_EQ(clip.window_spans(), "0 100;");
  for (std::size_t i = 0; i < clip.global.input.size(); ++i) {
    ASSERT_EQ(clip.global.output[i].x, clip.global.input[i].x);
    ASSERT_EQ(clip.global.output[i].y, clip.global.input[i].y);
  }

  CPWarper warper(100, 1920, 1080);
  warper.buildDisplacements(boost::make_shared<stabilizer_global>(clip.global), clip.windows,
                            clip.transitions, params_1080p(), [] {});
  warper.drive([] {});
  for (std::size_t f = 0; f < 100; ++f) {
    const VarVector& grid = *warper.frameWarp(f);
    for (int r = 0; r < grid.rows; ++r) {
      for (int c = 0; c < grid.cols; ++c) {
        ASSERT_NEAR(grid.vertex(c, r).x, c * warper.cellWidth(), 1e-8);
        ASSERT_NEAR(grid.vertex(c, r).y, r * warper.cellHeight(), 1e-8);
      }
    }
  }
}

// The ranks at which the solve was tried again, in order.
std::string lower_ranks(const std::string& log) {
  const std::string line = "stabilizer failed, trying lower rank ";
  std::string ranks;
  for (std::size_t at = log.find(line); at != std::string::npos; at = log.find(line, at + 1)) {
    ranks += log[at + line.size()];
  }
  return ranks;
}

TEST(StabilizerMainDegenerate, RankFallsToWhatTheTracksHold) {
  // All tracks on one still point: one signal, and every other coefficient a multiple of its own.
  stabilizer_global point = empty_table(100, 50);
  for (int s = 0; s < 50; ++s) {
    put_track(point, s, 0, 100, [](int) { return point2{512, 512}; });
  }
  const solved_clip clip = solve(std::move(point), params_1080p());
  ASSERT_EQ(clip.result, 1);
  EXPECT_EQ(lower_ranks(clip.log), "421");
  ASSERT_EQ(clip.window_spans(), "0 100;");
  EXPECT_EQ(clip.windows.front().rank, 1u);
  for (const track_sample& s : clip.global.output) {
    ASSERT_NEAR(s.x, 512, 1e-4);
    ASSERT_NEAR(s.y, 512, 1e-4);
  }
}

TEST(StabilizerMainDegenerate, TracksAtTheOriginHoldNothing) {
  stabilizer_global origin = empty_table(100, 50);
  for (int s = 0; s < 50; ++s) put_track(origin, s, 0, 100, [](int) { return point2{0, 0}; });
  const solved_clip clip = solve(std::move(origin), params_1080p());
  EXPECT_EQ(clip.result, 0);
  EXPECT_EQ(lower_ranks(clip.log), "4210");
  EXPECT_TRUE(clip.windows.empty());
  EXPECT_TRUE(clip.transitions.empty());
}

TEST(StabilizerMainDegenerate, FullRankIsKeptByAnyRealMotion) {
  for (const synthetic::track_scene scene :
       {synthetic::track_scene::planar, synthetic::track_scene::translation,
        synthetic::track_scene::similarity, synthetic::track_scene::still}) {
    synthetic::track_world_options options;
    options.frame_count = 120;
    options.slots = 150;
    options.scene = scene;
    options.noise = scene == synthetic::track_scene::still ? 1e-3 : 0;
    const solved_clip clip = solve(make_track_world(options), params_1080p());
    ASSERT_EQ(clip.result, 1);
    ASSERT_EQ(clip.windows.size(), 1u);
    EXPECT_EQ(clip.windows.front().rank, 9u) << "scene " << static_cast<int>(scene);
  }
}

TEST(StabilizerMainDegenerate, FewerFramesThanTheRank) {
  for (const int frames : {1, 2, 5, 8}) {
    const solved_clip clip = solve(shaken(frames, 60, 0, frames), params_1080p());
    ASSERT_EQ(clip.result, 1) << frames;
    EXPECT_NE(clip.log.find("Moving factorizatoin disabled because of too few frames (" +
                            std::to_string(frames) + ")."),
              std::string::npos);
    EXPECT_TRUE(clip.windows.empty());
    // Tracks of fewer than five frames do not count.
    EXPECT_EQ(clip.transition_spans(),
              (frames < 5 ? "unsolved 0 " : "solved 0 ") + std::to_string(frames) + ";");
  }
}

TEST(StabilizerMainDegenerate, FewerTracksThanHalfTheRank) {
  // Four slots are too few by the table, eight slots with four tracks by the scan.
  for (const int slots : {1, 2, 4, 8}) {
    const solved_clip clip = solve(shaken(120, slots, 0, 120, slots == 8 ? 4 : 0), params_1080p());
    ASSERT_EQ(clip.result, 1) << slots;
    EXPECT_EQ(clip.log.find("disabled"), std::string::npos);
    EXPECT_TRUE(clip.windows.empty());
    EXPECT_EQ(clip.transition_spans(), slots == 1 ? "unsolved 0 120;" : "solved 0 120;");
    if (slots < 4) continue;
    const Trajectory& t = clip.global.trajectories.front();
    EXPECT_LT(roughness(clip, clip.global.output, t), 0.2 * roughness(clip, clip.global.input, t));
  }
}

TEST(StabilizerMainDegenerate, NothingTracked) {
  for (const int frames : {1, 50}) {
    stabilizer_global zeros = empty_table(frames, 100);
    for (track_sample& s : zeros.input) s = {0, 0, 0, 0};  // no sample ever starts a track
    for (stabilizer_global global : {std::move(zeros), empty_table(frames, 100)}) {
      const solved_clip clip = solve(std::move(global), params_1080p());
      ASSERT_EQ(clip.result, 1);
      EXPECT_TRUE(clip.windows.empty());
      EXPECT_EQ(clip.transition_spans(), "unsolved 0 " + std::to_string(frames) + ";");
      for (const double v : clip.transitions.front().motion) EXPECT_TRUE(v == 0 || v == 1);
      for (const track_sample& s : clip.global.output) ASSERT_EQ(s.status, -1);
    }
  }
}

// 100 tracks fade by 0.01 a frame each, so they hold 7.5 up to frame 112; a window of 113 frames at
// most ends at 110, as it grows from 40 by fives.
TEST(StabilizerMainDegenerate, EverythingDiesAtOnce) {
  const solved_clip clip = solve(shaken(200, 100, 0, 120), params_1080p());
  ASSERT_EQ(clip.result, 1);
  EXPECT_EQ(clip.window_spans(), "0 110;");
  EXPECT_EQ(clip.transition_spans(), "solved 110 120;unsolved 120 200;");
  for (const Trajectory& t : clip.global.trajectories) {
    EXPECT_LT(roughness(clip, clip.global.output, t), 0.1);
    EXPECT_GT(roughness(clip, clip.global.input, t), 10);
  }
}

// All tracks end at a cut and others begin: as 200 hold 7.5 up to frame 146 and from 153 on, the
// windows are [0, 145) and [153, 300) with a transition over the cut.
TEST(StabilizerMainDegenerate, SceneCut) {
  stabilizer_global global = empty_table(300, 200);
  for (int s = 0; s < 200; ++s) {
    for (const int first : {0, 150}) {
      put_track(global, s, first, first + 150, [&](int f) {
        const point2 p = scattered(s + first);
        return point2{p.x + 8 * std::sin(1.7 * f), p.y + 6 * std::cos(2.9 * f)};
      });
    }
  }
  const solved_clip clip = solve(std::move(global), params_1080p());
  ASSERT_EQ(clip.result, 1);
  EXPECT_EQ(clip.window_spans(), "0 145;153 300;");
  EXPECT_EQ(clip.transition_spans(), "solved 145 163;");
  const std::vector<track_sample> blended = blended_output(clip, params_1080p());
  for (std::size_t f = 1; f + 1 < 300; ++f) {
    if (f == 149 || f == 150) continue;  // no track lives on both sides
    EXPECT_LT(median_bend(clip, blended, f), 0.3) << "frame " << f;
  }
}

// Frames without any track between two windows: each is bridged to its side of them.
TEST(StabilizerMainDegenerate, HoleInTheMiddle) {
  synthetic::track_world_options options;
  options.slots = 300;
  options.mean_life = 200;
  options.scene = synthetic::track_scene::similarity;  // what a transition can follow
  options.hole = {140, 160};
  const solved_clip clip = solve(make_track_world(options), params_1080p());
  ASSERT_EQ(clip.result, 1);
  ASSERT_EQ(clip.windows.size(), 2u);
  const std::uint64_t end = clip.windows[0].end, first = clip.windows[1].first;
  EXPECT_GE(end, 120u);
  EXPECT_LE(first, 180u);
  EXPECT_EQ(clip.transition_spans(), "solved " + std::to_string(end) +
                                         " 140;unsolved 140 160;solved 160 " +
                                         std::to_string(first + 10) + ";");
  // In a transition the tracks keep their noise of 0.1 pixels, which bends them by 0.3.
  const std::vector<track_sample> blended = blended_output(clip, params_1080p());
  for (std::size_t f = 1; f + 1 < 300; ++f) {
    if (f >= 139 && f <= 160) continue;
    EXPECT_LT(median_bend(clip, blended, f), 0.5) << "frame " << f;
    EXPECT_GT(median_bend(clip, clip.global.input, f), 1.0);
  }
  EXPECT_LT(median_bend(clip, blended, 100), 0.15);
  EXPECT_LT(median_bend(clip, blended, 220), 0.15);
}

}  // namespace
}  // namespace marrow::stabilization
