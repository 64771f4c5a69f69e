#include "stabilization/stabilizer_main.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <string>
#include <utility>
#include <vector>

#include "tests/stabilization/clips.h"
#include "tests/stabilization/dense_reference.h"

// Whole clips, with known motion or with little to go by.
namespace marrow::stabilization {
namespace {

// Tracks that all span the clip weigh the same on each frame: whatever the rank, each comes out as
// if it were smoothed by itself.
TEST(StabilizerMain, WholeTracksComeOutAsADenseFilterOfEach) {
  constexpr std::size_t kFrames = 150, kTrack = 7;
  for (const double lambda : {.4, 20., 200.}) {
    SolverParamsRecord parameters = params_1080p();
    parameters.smoothness_lambda = lambda;
    const solved_clip clip = solve(shaken_clip(kFrames, {{80, 0, kFrames}}), parameters);
    ASSERT_EQ(spans_of(clip.windows), "0 150;");
    for (const auto axis : {&track_sample::x, &track_sample::y}) {
      dense_reference filter(kFrames);
      for (std::size_t f = 0; f < kFrames; ++f) {
        filter.add(1, {{f, 1}}, clip.global.input_at(f, kTrack).*axis);
        if (f == 0 || f + 1 == kFrames) continue;
        filter.add(lambda * lambda, {{f - 1, 1}, {f, -2}, {f + 1, 1}}, 0);
      }
      const std::vector<double> expected = filter.solve();
      for (std::size_t f = 0; f < kFrames; ++f) {
        EXPECT_NEAR(clip.global.output_at(f, kTrack).*axis, expected[f], 2e-3)
            << "lambda " << lambda << ", frame " << f;
      }
    }
  }
}

// Some tracks jump by 40 pixels in mid-life.
TEST(StabilizerMain, TracksThatJumpTakeNoPart) {
  stabilizer_global global = clip_of(world_of(300, 500));
  const auto jumps = [](const Trajectory& t) {
    return t.feature % 10 == 0 && t.last - t.first > 80;
  };
  for (const Trajectory& t : global.trajectories) {
    for (int f = (t.first + t.last) / 2; jumps(t) && f < t.last; ++f) {
      global.input[f * global.feature_count + t.feature].x += 40;
    }
  }
  const solved_clip clip = solve(std::move(global), params_1080p());
  ASSERT_EQ(spans_of(clip.windows), "0 300;");
  const factorization_window& window = clip.windows.front();
  EXPECT_EQ(window.rank, 9u);
  std::size_t jumped = 0, sound = 0, taken = 0;
  for (std::size_t t = 0; t < clip.global.trajectories.size(); ++t) {
    const Trajectory& track = clip.global.trajectories[t];
    const bool is_sound = track.last - track.first >= 10 && !jumps(track);
    jumped += jumps(track);
    sound += is_sound;
    taken += window.takes_part(t);
    EXPECT_TRUE(is_sound || !window.takes_part(t));
  }
  EXPECT_GE(jumped, 10u);
  EXPECT_GT(taken, sound * 95 / 100);
}

// The blend over the overlap hides the step from one solution to the next.
TEST(StabilizerMain, NeighbouringWindowsAgreeWhereTheyOverlap) {
  const solved_clip clip = solve(clip_of(world_of(900, 500)), params_1080p());
  ASSERT_EQ(spans_of(clip.windows), "0 300;270 570;540 840;810 900;");
  for (const factorization_window& window : clip.windows) {
    EXPECT_EQ(window.overlap_end, window.first + (window.first > 0 ? 30 : 0));
  }
  const std::vector<track_sample> blended = blended_output(clip);
  for (std::size_t f = 1; f + 1 < 900; ++f) {
    EXPECT_GT(median_bend(clip, clip.global.input, f), 1.0);
    EXPECT_LT(median_bend(clip, blended, f), 0.15) << "frame " << f;
  }
}

// The k-th progress call ends the work, for k all over its length, with windows, their overlaps,
// bridges of each kind, warps and the frame map among what is under way.
TEST(StabilizerMain, ProgressMayEndItAnywhere) {
  synthetic::track_world_options options = world_of(120, 60, 200);
  options.hole = {70, 74};
  const stabilizer_global global = clip_of(options);
  SolverParamsRecord parameters = params_1080p();
  parameters.duration = 20;
  parameters.max_factorization_frames = 40;
  parameters.factorization_window_overlap = 10;
  parameters.track_fade_duration = 20;
  struct cancelled {};
  const auto calls_until = [&](std::size_t stop) {
    std::size_t calls = 0;
    const progress_functor progress = [&] {
      if (++calls == stop) throw cancelled();
    };
    const solved_clip clip = solve(global, parameters, progress);
    CPWarper warper(120, 1920, 1080);
    warper.buildDisplacements(boost::make_shared<stabilizer_global>(clip.global), clip.windows,
                              clip.transitions, parameters, progress);
    warper.drive(progress);
    warper.makeFrameMap(1, progress);
    EXPECT_FALSE(clip.transitions.empty());
    return calls;
  };
  for (const int kind : {0, 1, 2}) {
    parameters.no_motion = kind == 1;
    parameters.use_new_solver = kind != 2;
    const std::size_t all = calls_until(0);
    EXPECT_GT(all, 1000u);
    for (std::size_t k = 0; k < 30; ++k)
      EXPECT_THROW(calls_until(1 + k * (all - 1) / 29), cancelled);
  }
}

// All tracks in one place: a single signal, and every other coefficient a multiple of its own.
stabilizer_global tracks_at(point2 p) {
  return clip_of(100, {{50, 0, 100}}, [p](std::size_t, int) { return p; });
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

// Seven tracks live on across a gap, and four on each side of it do not.
stabilizer_global across_a_gap() {
  return shaken_clip(400, {{7, 0, 400}, {4, 0, 150}, {4, 170, 330}});
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

TEST(StabilizerMain, EveryClipComesOutCovered) {
  using enum synthetic::track_scene;
  constexpr double kAny = std::numeric_limits<double>::infinity();
  const struct {
    const char* situation;
    stabilizer_global global;
    int result;
    const char *ranks, *windows, *transitions;
    double bend;  // pixels: what a typical track may still bend on any frame
  } clips[] = {{"rank 1", tracks_at({512, 512}), 1, "421", "0 100;", "", 1e-3},
               {"nothing to hold", tracks_at({0, 0}), 0, "4210", "", "", kAny},
               {"a plane", scene(planar), 1, "", "0 120;", "", 0.3},
               {"similarities alone", scene(similarity), 1, "", "0 120;", "", 0.3},
               {"noise alone", scene(still), 1, "", "0 120;", "", 0.3},
               // Fewer frames than the rank; tracks under five frames do not count.
               {"four frames", shaken_clip(4, {{60, 0, 4}}), 1, "", "", "unsolved 0 4;", kAny},
               {"five frames", shaken_clip(5, {{60, 0, 5}}), 1, "", "", "solved 0 5;", 3},
               // Tracks too few for the rank, by the table or by the scan.
               {"one track", shaken_clip(120, {{1, 0, 120}}), 1, "", "", "unsolved 0 120;", kAny},
               {"four of eight slots", shaken_clip(120, {{4, 0, 0}, {4, 0, 120}}), 1, "", "",
                "solved 0 120;", 3},
               {"too few complete", clip_of(world_of(200, 20)), 1, "", "", "solved 0 200;", kAny},
               {"no tracks on one frame", empty_clip(100, 1), 1, "", "", "unsolved 0 1;", kAny},
               // 100 tracks fade by 0.01 a frame each, so they hold 7.5 up to frame 112; a window
               // of 113 frames at most ends at 110, as it grows from 40 by fives.
               {"all die at once", shaken_clip(200, {{100, 0, 120}}), 1, "", "0 110;",
                "solved 110 120;unsolved 120 200;", 0.3},
               // 200 tracks hold 7.5 up to frame 146 and from 153 on.
               {"scene cut", shaken_clip(300, {{200, 0, 150}, {200, 150, 300}}), 1, "",
                "0 145;153 300;", "solved 145 163;", 0.3},
               // 11 tracks hold it up to frame 137 and from 182 to 317.
               {"few tracks across a gap", across_a_gap(), 1, "", "0 135;182 317;",
                "solved 135 192;solved 317 400;", 0.3},
               // 300 tracks hold it up to frame 137 and from 162 on. In a transition they keep
               // their noise of 0.1 pixels, which bends them by 0.3.
               {"hole", hole_in_the_middle(), 1, "", "0 135;162 300;",
                "solved 135 140;unsolved 140 160;solved 160 172;", 0.5}};
  for (const auto& e : clips) {
    SCOPED_TRACE(e.situation);
    const solved_clip clip = solve(e.global, params_1080p());
    EXPECT_EQ(clip.result, e.result);
    EXPECT_EQ(lower_ranks(clip.log), e.ranks);
    EXPECT_EQ(spans_of(clip.windows), e.windows);
    EXPECT_EQ(spans_of(clip.transitions), e.transitions);
    EXPECT_EQ(clip.log.find("disabled because of too few frames") != std::string::npos,
              e.global.frame_count < 9);
    expect_unsolved_untouched(clip.global, clip.transitions);
    if (e.bend == kAny) continue;
    const std::vector<track_sample> blended = blended_output(clip);
    for (std::size_t f = 1; f + 1 < clip.global.frame_count; ++f) {
      EXPECT_FALSE(median_bend(clip, blended, f) > e.bend) << "frame " << f;
    }
  }
}

// At a lower threshold 5 tracks make a window, but they can't lead from it into a transition. The 8
// behind them hold 2.5 from frame 191 on.
TEST(StabilizerMain, WindowsOfFewTracksAreBridged) {
  SolverParamsRecord parameters = params_1080p();
  parameters.conservative_threshold = 2.5;
  for (const bool no_motion : {false, true}) {
    parameters.no_motion = no_motion;
    const solved_clip clip = solve(shaken_clip(300, {{5, 0, 140}, {8, 160, 300}}), parameters);
    EXPECT_EQ(clip.result, 1);
    EXPECT_EQ(spans_of(clip.windows), "191 300;");
    EXPECT_EQ(spans_of(clip.transitions), "solved 0 140;unsolved 140 160;solved 160 201;");
  }
}

}  // namespace
}  // namespace marrow::stabilization
