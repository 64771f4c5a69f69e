#include <gtest/gtest.h>

#include <cmath>
#include <string>
#include <vector>

#include "tests/stabilization/solve_clips.h"

// Clips with little or nothing to go by.
namespace marrow::stabilization {
namespace {

using ::testing::TestWithParam;

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
  // Nine signals are not there to be found.
  EXPECT_NE(clip.log.find("stabilizer failed, trying lower rank 4\n"), std::string::npos);
  ASSERT_EQ(clip.windows.size(), 1u);
  EXPECT_LE(clip.windows.front().rank, 4u);
  for (std::size_t i = 0; i < clip.global.input.size(); ++i) {
    ASSERT_EQ(clip.global.output[i].x, clip.global.input[i].x);
    ASSERT_EQ(clip.global.output[i].y, clip.global.input[i].y);
  }
  std::printf("rank %d\n", (int)clip.windows.front().rank);
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
    std::printf("%d frames %s\n", frames, clip.transition_spans().c_str());
    ASSERT_EQ(clip.transitions.size(), 1u);
    EXPECT_EQ(clip.transitions.front().first, 0u);
    EXPECT_EQ(clip.transitions.front().end, static_cast<std::uint64_t>(frames));
  }
}

TEST(StabilizerMainDegenerate, FewerTracksThanHalfTheRank) {
  // Four slots are too few by the table, eight slots with four tracks by the scan.
  for (const int slots : {1, 2, 4, 8}) {
    const solved_clip clip =
        solve(shaken(120, slots, 0, 120, slots == 8 ? 4 : 0), params_1080p());
    ASSERT_EQ(clip.result, 1) << slots;
    EXPECT_EQ(clip.log.find("disabled"), std::string::npos);
    EXPECT_TRUE(clip.windows.empty());
    EXPECT_EQ(clip.transition_spans(), slots == 1 ? "unsolved 0 120;" : "solved 0 120;");
    if (slots < 4) continue;
    const Trajectory& t = clip.global.trajectories.front();
    EXPECT_LT(roughness(clip, clip.global.output, t),
              0.2 * roughness(clip, clip.global.input, t));
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

TEST(StabilizerMainDegenerate, EverythingDiesAtOnce) {
  // All tracks end in mid-clip and nothing follows.
  const solved_clip clip = solve(shaken(200, 100, 0, 120), params_1080p());
  ASSERT_EQ(clip.result, 1);
  std::printf("dies: %s %s\n", clip.window_spans().c_str(), clip.transition_spans().c_str());
}

TEST(StabilizerMainDegenerate, SceneCut) {
  stabilizer_global global = empty_table(300, 200);
  for (int s = 0; s < 200; ++s) {
    put_track(global, s, 0, 150, [&](int f) {
      return point2{scattered(s).x + 8 * std::sin(1.7 * f), scattered(s).y + 6 * std::cos(2.9 * f)};
    });
    put_track(global, s, 150, 300, [&](int f) {
      return point2{scattered(s + 7).x + 8 * std::sin(1.7 * f),
                    scattered(s + 7).y + 6 * std::cos(2.9 * f)};
    });
  }
  const solved_clip clip = solve(std::move(global), params_1080p());
  ASSERT_EQ(clip.result, 1);
  std::printf("cut: %s %s\n", clip.window_spans().c_str(), clip.transition_spans().c_str());
}

TEST(StabilizerMainDegenerate, HoleInTheMiddle) {
  synthetic::track_world_options options;
  options.frame_count = 300;
  options.slots = 300;
  options.mean_life = 200;
  options.hole = {140, 160};
  const solved_clip clip = solve(make_track_world(options), params_1080p());
  ASSERT_EQ(clip.result, 1);
  std::printf("hole: %s %s\n", clip.window_spans().c_str(), clip.transition_spans().c_str());
  for (std::size_t f = 1; f + 1 < 300; ++f) {
    std::vector<double> bends;
    for (const Trajectory& t : clip.global.trajectories) {
      bends.push_back(clip.bend(clip.global.output, t, f));
    }
    double m = median(bends);
    if (m > 0.1) std::printf("  %zu: %g\n", f, m);
  }
}

}  // namespace
}  // namespace marrow::stabilization
