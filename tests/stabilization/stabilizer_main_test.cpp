#include "stabilization/stabilizer_main.h"

#include <gtest/gtest.h>

#include <cmath>
#include <numbers>
#include <utility>
#include <vector>

#include "stabilization/factorization/window_filters.h"
#include "stabilization/warp/cp_warper.h"
#include "tests/stabilization/solve_clips.h"

// Whole clips with known motion. Clips with little to go by are in stabilizer_main_degenerate_test.
namespace marrow::stabilization {
namespace {

// A scene that only shifts, on tracks that all span the clip: the filter's gain can be read off.
template <class Shift>
stabilizer_global shifted(int frames, Shift shift) {
  stabilizer_global global = empty_clip(80, frames);
  for (std::size_t s = 0; s < 80; ++s) {
    put_track(global, s, 0, frames, [&](int f) {
      return point2{scattered(s).x + shift(f).x, scattered(s).y + shift(f).y};
    });
  }
  return global;
}

TEST(StabilizerMain, SinusoidsComeOutWithTheFiltersGain) {
  // 1 / (1 + lambda^2 (2 sin(pi / T))^4). At lambda 200 half the power is left at T = 89.
  const struct {
    double lambda, period, gain;
  } cases[] = {{200, 200, .9625}, {200, 100, .6161}, {200, 89, .5018}, {200, 50, .0913},
               {200, 20, .0026},  {20, 25, .3877},   {.4, 4, .6098}};
  for (const auto& e : cases) {
    const double omega = 2 * std::numbers::pi / e.period;
    SolverParamsRecord parameters = params_1080p();
    parameters.smoothness_lambda = e.lambda;
    const solved_clip clip =
        solve(shifted(330,
                      [&](int f) {
                        return point2{30 * std::sin(omega * f), 20 * std::cos(omega * f)};
                      }),
              parameters);
    ASSERT_EQ(clip.result, 1);
    ASSERT_EQ(spans_of(clip.windows), "0 330;");
    // Over half a period, away from the clip's ends, whose effect falls by e every 20 frames.
    double in = 0, out = 0;
    for (int f = 165 - static_cast<int>(e.period / 4); f < 165 + e.period / 4; ++f) {
      const double wave[2] = {std::sin(omega * f) / 30, std::cos(omega * f) / 20};
      const point2 rest = scattered(0);
      const point2 a = position(clip.global.input_at(f, 0));
      const point2 b = position(clip.global.output_at(f, 0));
      in += wave[0] * (a.x - rest.x) + wave[1] * (a.y - rest.y);
      out += wave[0] * (b.x - rest.x) + wave[1] * (b.y - rest.y);
    }
    EXPECT_NEAR(out / in, e.gain, 0.02 * e.gain + 1e-4) << e.lambda << ", period " << e.period;
  }
}

TEST(StabilizerMain, ComesNearTheCameraWithoutItsShake) {
  for (const double jitter : {2e-3, 5e-4}) {
    synthetic::track_world_options options = world_of(300, 200);
    options.gain = 0.1;
    options.rotation_jitter = jitter;
    options.translation_jitter = 0;
    options.whole_clip = true;
    options.noise = 0;
    const synthetic::track_world world = make_track_world(options);
    const solved_clip clip = solve(*world.global, params_1080p());
    ASSERT_EQ(clip.result, 1);
    double in = 0, out = 0;
    for (std::size_t i = 0; i < world.intended.size(); ++i) {
      const synthetic::point2 truth = world.intended[i];
      const track_sample& a = clip.global.input[i];
      const track_sample& b = clip.global.output[i];
      in += std::pow(a.x - truth.x, 2) + std::pow(a.y - truth.y, 2);
      out += std::pow(b.x - truth.x, 2) + std::pow(b.y - truth.y, 2);
    }
    // White shake has slow parts too: it cannot go to nothing.
    EXPECT_LT(std::sqrt(out), 0.25 * std::sqrt(in)) << "shake " << jitter;
  }
}

// Some tracks jump by 40 pixels in mid-life.
TEST(StabilizerMain, ALivelySceneComesOutSmoothWithoutTheTracksThatJump) {
  stabilizer_global global = clip_of(world_of(300, 500));
  const auto jumps = [](const Trajectory& t) {
    return t.feature % 10 == 0 && t.last - t.first > 80;
  };
  build_trajectories(global);
  for (const Trajectory& t : global.trajectories) {
    for (int f = (t.first + t.last) / 2; jumps(t) && f < t.last; ++f) {
      global.input[f * global.feature_count + t.feature].x += 40;
    }
  }
  const solved_clip clip = solve(std::move(global), params_1080p());
  ASSERT_EQ(clip.result, 1);
  EXPECT_EQ(spans_of(clip.windows), "0 300;");
  EXPECT_EQ(spans_of(clip.transitions), "");
  const factorization_window& window = clip.windows.front();
  EXPECT_EQ(window.rank, 9u);
  std::vector<double> errors, rough_in, rough_out;
  std::size_t jumped = 0, sound = 0;
  for (std::size_t t = 0; t < clip.global.trajectories.size(); ++t) {
    const Trajectory& track = clip.global.trajectories[t];
    jumped += jumps(track);
    sound += track.last - track.first >= 10 && !jumps(track);
    if (!window.takes_part(t)) continue;
    EXPECT_TRUE(track.last - track.first >= 10 && !jumps(track));
    double largest = 0;
    for (int f = track.first; f < track.last; ++f) {
      largest = std::max(largest, double{clip.global.output_at(f, track.feature).error});
    }
    errors.push_back(largest);
    const int begin = track.first + 1, end = track.last - 1;
    rough_in.push_back(roughness(clip.global, clip.global.input, track.feature, begin, end));
    rough_out.push_back(roughness(clip.global, clip.global.output, track.feature, begin, end));
  }
  EXPECT_GE(jumped, 10u);
  EXPECT_GT(errors.size(), sound * 95 / 100);
  EXPECT_LT(median(errors), 0.5);
  EXPECT_GT(median(rough_in), 5.0);
  EXPECT_LT(median(rough_out), median(rough_in) / 100);
  EXPECT_TRUE(quality_check(clip.global, window, params_1080p(), 50.0, kNoProgress).passes);
}

TEST(StabilizerMain, NeighbouringWindowsAgreeWhereTheyOverlap) {
  const solved_clip clip = solve(clip_of(world_of(900, 500)), params_1080p());
  ASSERT_EQ(clip.result, 1);
  ASSERT_EQ(spans_of(clip.windows), "0 300;270 570;540 840;810 900;");
  for (std::size_t w = 1; w < clip.windows.size(); ++w) {
    const factorization_window& window = clip.windows[w];
    ASSERT_EQ(window.overlap_end, window.first + 30);
    std::vector<double> apart;
    for (const std::size_t row : {0, 15, 29}) {
      std::vector<double> distances;
      for (std::size_t s = 0; s < 500; ++s) {
        const track_sample& before = window.overlap_rows[row * 500 + s];
        const track_sample& after = clip.global.output_at(window.first + row, s);
        if (before.status < 0 || after.status < 0) continue;
        distances.push_back(std::hypot(before.x - after.x, before.y - after.y));
      }
      EXPECT_GT(distances.size(), 300u);
      apart.push_back(median(distances));
    }
    EXPECT_LT(apart[0], 0.6) << w;
    EXPECT_LT(apart[1], 0.8) << w;
    EXPECT_LT(apart[2], 10.0) << w;  // the old window's free end
    EXPECT_GT(apart[2], apart[0]) << w;
  }
  // The blend over the overlap hides the step from one solution to the next.
  const std::vector<track_sample> blended = blended_output(clip);
  for (std::size_t f = 1; f + 1 < 900; ++f) {
    EXPECT_GT(median_bend(clip, clip.global.input, f), 1.0);
    EXPECT_LT(median_bend(clip, blended, f), 0.15) << "frame " << f;
  }
}

// The furthest that a track comes from its first place among frames [first, end), in pixels.
double largest_travel(const solved_clip& clip, int first, int end) {
  double largest = 0;
  for (const Trajectory& t : clip.global.trajectories) {
    const track_sample* start = nullptr;
    for (int f = std::max<int>(t.first, first); f < std::min<int>(t.last, end); ++f) {
      const track_sample& s = clip.global.output_at(f, t.feature);
      if (s.status < 0) continue;
      if (!start) start = &s;
      largest = std::max<double>(largest, std::hypot(s.x - start->x, s.y - start->y));
    }
  }
  return largest;
}

// Tracks that are missing on a window's first frame have nothing to hold them there, so stillness
// from window to window is a promise for long tracks alone.
TEST(StabilizerMain, NoMotionHoldsEveryTrackStill) {
  SolverParamsRecord parameters = params_1080p();
  parameters.no_motion = true;
  const struct {
    int frames;
    double mean_life, gain, travel;
    std::vector<int> starts;  // of the windows, and the end
  } cases[] = {{300, 60, 0, 1e-3, {0, 300}},
               {300, 60, .3, 1e-3, {0, 300}},
               {900, 2000, .1, .004, {0, 270, 540, 810, 900}}};
  for (const auto& e : cases) {
    synthetic::track_world_options options = world_of(e.frames, 200, e.mean_life);
    options.gain = e.gain;
    const solved_clip clip = solve(clip_of(options), parameters);
    ASSERT_EQ(clip.windows.size(), e.starts.size() - 1);
    for (std::size_t w = 0; w < clip.windows.size(); ++w) {
      const int first = e.starts[w];
      EXPECT_EQ(clip.windows[w].first, static_cast<std::uint64_t>(first));
      EXPECT_LT(largest_travel(clip, first, e.starts[w + 1]), e.travel) << "window " << w;
      std::vector<double> steps;
      for (std::size_t s = 0; w > 0 && s < 200; ++s) {
        const track_sample& before = clip.global.output_at(first - 1, s);
        const track_sample& after = clip.global.output_at(first, s);
        if (before.status < 0 || after.status < 0) continue;
        steps.push_back(std::hypot(before.x - after.x, before.y - after.y));
      }
      EXPECT_TRUE(w == 0 || (steps.size() > 150 && median(steps) < 1.0)) << "into window " << w;
    }
  }
}

// The k-th progress call ends the work, for k all over its length, with windows, their overlaps,
// bridges of each kind, warps and the frame map among what is under way.
TEST(StabilizerMain, ProgressMayEndItAnywhere) {
  synthetic::track_world_options options = world_of(120, 60, 200);
  options.hole = {70, 74};
  const stabilizer_global global = clip_of(options);
  for (const int kind : {0, 1, 2}) {
    SolverParamsRecord parameters = params_1080p();
    parameters.duration = 20;
    parameters.max_factorization_frames = 40;
    parameters.factorization_window_overlap = 10;
    parameters.track_fade_duration = 20;
    parameters.no_motion = kind == 1;
    parameters.use_new_solver = kind != 2;
    struct cancelled {};
    const auto calls_until = [&](std::size_t stop) {
      std::size_t calls = 0;
      try {
        const progress_functor progress = [&] {
          if (++calls == stop) throw cancelled();
        };
        const solved_clip clip = solve(global, parameters, progress);
        CPWarper warper(120, 1920, 1080);
        warper.buildDisplacements(boost::make_shared<stabilizer_global>(clip.global), clip.windows,
                                  clip.transitions, parameters, progress);
        warper.drive(progress);
        warper.makeFrameMap(1, progress);
        EXPECT_EQ(clip.result, 1);
        EXPECT_GT(clip.windows.size(), 2u);
        EXPECT_FALSE(clip.transitions.empty());
      } catch (const cancelled&) {
        EXPECT_EQ(calls, stop);
      }
      return calls;
    };
    const std::size_t all = calls_until(0);
    EXPECT_GT(all, 1000u);
    for (std::size_t k = 0; k < 30; ++k) {
      const std::size_t stop = 1 + k * (all - 1) / 29;
      EXPECT_EQ(calls_until(stop), stop);
    }
  }
}

}  // namespace
}  // namespace marrow::stabilization
