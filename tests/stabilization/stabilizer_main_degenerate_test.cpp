#include <gtest/gtest.h>

#include <algorithm>
#include <limits>
#include <string>
#include <vector>

#include "tests/stabilization/solve_clips.h"
#include "tests/stabilization/warper_clips.h"

// Clips with little or nothing to go by.
namespace marrow::stabilization {
namespace {

// Points of a shaken camera in slots [slot_begin, slots).
stabilizer_global shaken_clip(int frames, int slots, int end, int slot_begin = 0) {
  stabilizer_global global = empty_clip(slots, frames);
  for (int s = slot_begin; s < slots; ++s) {
    put_track(global, s, 0, end, [s](int f) { return shaken(scattered(s), f); });
  }
  return global;
}

// All tracks in one place: a single signal, and every other coefficient a multiple of its own.
stabilizer_global tracks_at(point2 p) {
  stabilizer_global global = empty_clip(50, 100);
  for (int s = 0; s < 50; ++s) {
    put_track(global, s, 0, 100, [p](int) { return p; });
  }
  return global;
}

stabilizer_global scene_cut() {
  stabilizer_global global = empty_clip(200, 300);
  for (std::size_t s = 0; s < 200; ++s) {
    for (const int first : {0, 150}) {
      put_track(global, s, first, first + 150,
                [&](int f) { return shaken(scattered(s + first), f); });
    }
  }
  return global;
}

// No sample ever starts a track.
stabilizer_global never_started(int frames) {
  stabilizer_global global = empty_clip(100, frames);
  for (track_sample& s : global.input) s = {0, 0, 0, 0};
  return global;
}

stabilizer_global scene(synthetic::track_scene kind) {
  synthetic::track_world_options options = world_of(120, 150);
  options.scene = kind;
  options.noise = kind == synthetic::track_scene::still ? 1e-3 : 0;
  return clip_of(options);
}

// Frames without any track between two windows: each is bridged to its side of them.
stabilizer_global hole_in_the_middle() {
  synthetic::track_world_options options = world_of(300, 300, 200);
  options.scene = synthetic::track_scene::similarity;  // what a transition can follow
  options.hole = {140, 160};
  return clip_of(options);
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

struct degenerate_clip {
  const char* situation;
  stabilizer_global global;
  int result;
  const char *ranks, *windows, *transitions;
  double bend;  // pixels: what a typical track may still bend on any frame
};

TEST(StabilizerMainDegenerate, EveryClipComesOutCovered) {
  using enum synthetic::track_scene;
  constexpr double kAny = std::numeric_limits<double>::infinity();
  const degenerate_clip clips[] = {
      {"rank 1", tracks_at({512, 512}), 1, "421", "0 100;", "", 1e-3},
      {"nothing to hold", tracks_at({0, 0}), 0, "4210", "", "", kAny},
      {"a plane", scene(planar), 1, "", "0 120;", "", 0.3},
      {"shifts alone", scene(translation), 1, "", "0 120;", "", 0.3},
      {"similarities alone", scene(similarity), 1, "", "0 120;", "", 0.3},
      {"noise alone", scene(still), 1, "", "0 120;", "", 0.3},
      // Fewer frames than the rank; tracks under five frames do not count.
      {"one frame", shaken_clip(1, 60, 1), 1, "", "", "unsolved 0 1;", kAny},
      {"four frames", shaken_clip(4, 60, 4), 1, "", "", "unsolved 0 4;", kAny},
      {"five frames", shaken_clip(5, 60, 5), 1, "", "", "solved 0 5;", 3},
      {"eight frames", shaken_clip(8, 60, 8), 1, "", "", "solved 0 8;", 3},
      // Tracks too few for the rank, by the table or by the scan.
      {"one track", shaken_clip(120, 1, 120), 1, "", "", "unsolved 0 120;", kAny},
      {"four tracks", shaken_clip(120, 4, 120), 1, "", "", "solved 0 120;", 3},
      {"four of eight slots", shaken_clip(120, 8, 120, 4), 1, "", "", "solved 0 120;", 3},
      {"too few complete", clip_of(world_of(200, 20)), 1, "", "", "solved 0 200;", kAny},
      {"few but long", clip_of(world_of(200, 20, 200)), 1, "", "0 200;", "", 0.3},
      {"no tracks", empty_clip(100, 50), 1, "", "", "unsolved 0 50;", kAny},
      {"no tracks on one frame", empty_clip(100, 1), 1, "", "", "unsolved 0 1;", kAny},
      {"no starts", never_started(50), 1, "", "", "unsolved 0 50;", kAny},
      // 100 tracks fade by 0.01 a frame each, so they hold 7.5 up to frame 112; a window of 113
      // frames at most ends at 110, as it grows from 40 by fives.
      {"all die at once", shaken_clip(200, 100, 120), 1, "", "0 110;",
       "solved 110 120;unsolved 120 200;", 0.3},
      // 200 tracks hold 7.5 up to frame 146 and from 153 on.
      {"scene cut", scene_cut(), 1, "", "0 145;153 300;", "solved 145 163;", 0.3},
      // 300 tracks hold it up to frame 137 and from 162 on. In a transition they keep their noise
      // of 0.1 pixels, which bends them by 0.3.
      {"hole", hole_in_the_middle(), 1, "", "0 135;162 300;",
       "solved 135 140;unsolved 140 160;solved 160 172;", 0.5}};
  for (const degenerate_clip& e : clips) {
    SCOPED_TRACE(e.situation);
    const solved_clip clip = solve(e.global, params_1080p());
    EXPECT_EQ(clip.result, e.result);
    EXPECT_EQ(lower_ranks(clip.log), e.ranks);
    EXPECT_EQ(spans_of(clip.windows), e.windows);
    EXPECT_EQ(spans_of(clip.transitions), e.transitions);
    EXPECT_EQ(clip.log.find("disabled because of too few frames") != std::string::npos,
              e.global.frame_count < 9);
    std::vector<int> covered(clip.global.frame_count);
    for (const factorization_window& w : clip.windows) {
      std::fill(covered.begin() + w.first, covered.begin() + w.end, 1);
    }
    for (const transition_record& r : clip.transitions) {
      std::fill(covered.begin() + r.first, covered.begin() + r.end, 1);
      if (r.kind == transition_record::solved) continue;
      for (std::size_t k = 0; k < r.motion.size(); ++k) ASSERT_EQ(r.motion[k], k % 4 == 0);
      for (std::size_t i = 0; i < clip.global.feature_count; ++i) {
        for (std::size_t f = r.first; f < r.end; ++f) {
          ASSERT_EQ(clip.global.output_at(f, i).status, -1);
        }
      }
    }
    EXPECT_TRUE(std::count(covered.begin(), covered.end(), 0) == 0 || e.result == 0);
    if (e.bend == kAny) continue;
    const std::vector<track_sample> blended = blended_output(clip);
    for (std::size_t f = 1; f + 1 < clip.global.frame_count; ++f) {
      EXPECT_FALSE(median_bend(clip, blended, f) > e.bend) << "frame " << f;
    }
  }
}

TEST(StabilizerMainDegenerate, StillPictureComesOutExact) {
  synthetic::track_world_options options = world_of(100, 200);
  options.scene = synthetic::track_scene::still;
  options.noise = 0;
  options.whole_clip = true;
  const solved_clip clip = solve(clip_of(options), params_1080p());
  ASSERT_EQ(spans_of(clip.windows), "0 100;");
  for (std::size_t i = 0; i < clip.global.input.size(); ++i) {
    ASSERT_EQ(clip.global.output[i].x, clip.global.input[i].x);
    ASSERT_EQ(clip.global.output[i].y, clip.global.input[i].y);
  }
  const auto warper = built(boost::make_shared<stabilizer_global>(clip.global), 4, clip.windows);
  warper->drive(kNoProgress);
  for (int f = 0; f < 100; ++f) ASSERT_LT(distance_from(*warper, f, identity3), 1e-8);
}

}  // namespace
}  // namespace marrow::stabilization
