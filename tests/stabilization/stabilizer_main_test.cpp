#include "stabilization/stabilizer_main.h"

#include <gtest/gtest.h>

#include <cmath>
#include <numbers>
#include <tuple>
#include <vector>

#include "stabilization/factorization/active_track.h"
#include "stabilization/factorization/window_filters.h"
#include "tests/stabilization/solve_clips.h"

namespace marrow::stabilization {
namespace {

// With tracks that all span the clip every weight cancels: what comes out is the scene's motion
// signals, each through one fixed filter.
class WholeClipTracks : public ::testing::TestWithParam<std::tuple<int, double>> {};

TEST_P(WholeClipTracks, SignalsPassTheExactFilter) {
  const auto [frames, lambda] = GetParam();
  synthetic::track_world_options options;
  options.frame_count = frames;
  options.slots = 60;
  options.gain = 0.2;
  options.whole_clip = true;
  SolverParamsRecord parameters = params_1080p();
  parameters.smoothness_lambda = lambda;
  const synthetic::track_world world = make_track_world(options);
  const solved_clip clip = solve(world, parameters);
  ASSERT_EQ(clip.result, 1);
  ASSERT_EQ(clip.window_spans(), "0 " + std::to_string(frames) + ";");
  const factorization_window& window = clip.windows.front();
  ASSERT_EQ(window.rank, 9u);

  // Normal equations of all tracks' coefficients, the same on every frame.
  double normal[9][9] = {};
  std::vector<std::vector<double>> right(9, std::vector<double>(frames));
  for (std::size_t t = 0; t < 60; ++t) {
    ASSERT_TRUE(window.takes_part(t));
    for (int axis = 0; axis < 2; ++axis) {
      const double* c = window.coefficients_of(t) + 9 * axis;
      for (int i = 0; i < 9; ++i) {
        for (int j = 0; j < 9; ++j) normal[i][j] += c[i] * c[j];
        for (int f = 0; f < frames; ++f) {
          const track_sample& s = clip.global.input_at(f, clip.global.trajectories[t].feature);
          right[i][f] += c[i] * (axis ? s.y : s.x);
        }
      }
    }
  }
  for (int k = 0; k < 9; ++k) {
    for (int i = 0; i < 9; ++i) {
      if (i == k) continue;
      const double factor = normal[i][k] / normal[k][k];
      for (int j = 0; j < 9; ++j) normal[i][j] -= factor * normal[k][j];
      for (int f = 0; f < frames; ++f) right[i][f] -= factor * right[k][f];
    }
  }
  std::vector<std::vector<double>> basis;
  for (int i = 0; i < 9; ++i) {
    for (double& v : right[i]) v /= normal[i][i];
    basis.push_back(smoothed_signal(right[i], lambda));
  }

  double largest = 0;
  for (std::size_t t = 0; t < 60; ++t) {
    const double* c = window.coefficients_of(t);
    for (int f = 0; f < frames; ++f) {
      double x = 0, y = 0;
      for (int i = 0; i < 9; ++i) {
        x += c[i] * basis[i][f];
        y += c[9 + i] * basis[i][f];
      }
      const track_sample& out = clip.global.output_at(f, clip.global.trajectories[t].feature);
      largest = std::max(largest, std::hypot(out.x - x, out.y - y));
    }
  }
  EXPECT_LT(largest, 2e-4);  // a float at 1000 pixels is good to 6e-5
}

INSTANTIATE_TEST_SUITE_P(StabilizerMain, WholeClipTracks,
                         ::testing::Values(std::tuple(330, 0.4), std::tuple(200, 20.0),
                                           std::tuple(300, 200.0), std::tuple(330, 4000.0)));

// A scene that only shifts: the filter's gain can be read off the picture.
stabilizer_global shifted(int frames, const std::function<point2(int)>& shift) {
  stabilizer_global global = empty_table(frames, 80);
  for (std::size_t s = 0; s < 80; ++s) {
    put_track(global, s, 0, frames, [&](int f) {
      return point2{scattered(s).x + shift(f).x, scattered(s).y + shift(f).y};
    });
  }
  return global;
}

TEST(StabilizerMain, SinusoidsComeOutWithTheFiltersGain) {
  // 1 / (1 + lambda^2 (2 sin(pi / T))^4) at lambda 200. Half the power is left at T = 89.
  const std::pair<double, double> gains[] = {
      {200, 0.9625}, {100, 0.6161}, {89, 0.5018}, {50, 0.0913}, {20, 0.0026}};
  for (const auto& [period, gain] : gains) {
    const double omega = 2 * std::numbers::pi / period;
    const solved_clip clip =
        solve(shifted(330,
                      [&](int f) {
                        return point2{30 * std::sin(omega * f), 20 * std::cos(omega * f)};
                      }),
              params_1080p());
    ASSERT_EQ(clip.result, 1);
    ASSERT_EQ(clip.window_spans(), "0 330;");
    // Over half a period, away from the clip's ends, whose effect falls by e every 20 frames.
    double in = 0, out = 0;
    for (int f = 165 - static_cast<int>(period / 4); f < 165 + period / 4; ++f) {
      const track_sample& a = clip.global.input_at(f, 0);
      const track_sample& b = clip.global.output_at(f, 0);
      const double wave[2] = {std::sin(omega * f), std::cos(omega * f)};
      in += wave[0] * (a.x - scattered(0).x) / 30 + wave[1] * (a.y - scattered(0).y) / 20;
      out += wave[0] * (b.x - scattered(0).x) / 30 + wave[1] * (b.y - scattered(0).y) / 20;
    }
    EXPECT_NEAR(out / in, gain, 0.02 * gain + 1e-4) << "period " << period;
  }
}

TEST(StabilizerMain, StraightMotionPassesUnchanged) {
  const solved_clip clip = solve(shifted(300,
                                         [](int f) {
                                           return point2{3.0 * f - 450, 0.5 * f};
                                         }),
                                 params_1080p());
  ASSERT_EQ(clip.result, 1);
  for (std::size_t i = 0; i < clip.global.input.size(); ++i) {
    ASSERT_NEAR(clip.global.output[i].x, clip.global.input[i].x, 3e-4);
    ASSERT_NEAR(clip.global.output[i].y, clip.global.input[i].y, 3e-4);
  }
}

TEST(StabilizerMain, LivelySceneWithDyingTracks) {
  const solved_clip clip = solve(synthetic::make_track_world({}), params_1080p());
  ASSERT_EQ(clip.result, 1);
  EXPECT_EQ(clip.window_spans(), "0 300;");
  EXPECT_EQ(clip.transition_spans(), "");
  const factorization_window& window = clip.windows.front();
  EXPECT_EQ(window.rank, 9u);

  std::vector<double> errors, rough_in, rough_out;
  std::size_t outliers = 0;
  for (std::size_t t = 0; t < clip.global.trajectories.size(); ++t) {
    const Trajectory& trajectory = clip.global.trajectories[t];
    if (trajectory.last - trajectory.first < 10) {
      EXPECT_FALSE(window.takes_part(t));
      continue;
    }
    if (!window.takes_part(t)) {
      ++outliers;
      continue;
    }
    double largest = 0;
    for (int f = trajectory.first; f < trajectory.last; ++f) {
      largest = std::max(largest, double{clip.global.output_at(f, trajectory.feature).error});
    }
    errors.push_back(largest);
    rough_in.push_back(roughness(clip, clip.global.input, trajectory));
    rough_out.push_back(roughness(clip, clip.global.output, trajectory));
  }
  EXPECT_EQ(outliers, 0u);
  EXPECT_LT(median(errors), 0.5);
  EXPECT_GT(median(rough_in), 5.0);
  EXPECT_LT(median(rough_out), median(rough_in) / 100);

  const SolverParamsRecord parameters = params_1080p();
  EXPECT_TRUE(quality_check(clip.global, window, parameters, 50.0, [] {}).passes);
}

TEST(StabilizerMain, ComesNearTheCameraWithoutItsShake) {
  for (const double jitter : {2e-3, 5e-4}) {
    synthetic::track_world_options options;
    options.slots = 200;
    options.gain = 0.1;
    options.rotation_jitter = jitter;
    options.translation_jitter = 0;
    options.whole_clip = true;
    options.noise = 0;
    const synthetic::track_world world = make_track_world(options);
    const solved_clip clip = solve(world, params_1080p());
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

TEST(StabilizerMain, TracksThatJumpAreLeftOut) {
  synthetic::track_world_options options;
  options.frame_count = 200;
  options.slots = 300;
  options.mean_life = 120;
  stabilizer_global global = *make_track_world(options).global;
  std::vector<bool> jumped(global.feature_count);
  for (const Trajectory& t :
       tracking::BuildTrajectories(global.input.data(), 300, global.frame_count)) {
    if (t.feature % 10 != 0 || t.first != 0 || t.last < 100) continue;
    jumped[t.feature] = true;
    for (int f = t.last / 2; f < t.last; ++f) global.input[f * 300 + t.feature].x += 40;
  }
  const solved_clip clip = solve(std::move(global), params_1080p());
  ASSERT_EQ(clip.result, 1);
  ASSERT_EQ(clip.windows.size(), 1u);
  std::size_t left_out = 0, kept = 0, sound = 0;
  for (std::size_t t = 0; t < clip.global.trajectories.size(); ++t) {
    const Trajectory& trajectory = clip.global.trajectories[t];
    const bool in = clip.windows.front().takes_part(t);
    if (trajectory.first == 0 && jumped[trajectory.feature]) {
      EXPECT_FALSE(in);
      ++left_out;
    } else if (trajectory.last - trajectory.first >= 10) {
      ++sound;
      kept += in;
    }
  }
  EXPECT_GE(left_out, 5u);
  EXPECT_GT(kept, sound * 95 / 100);
}

// The k-th progress call ends the solve, for k all over its length, with windows, their overlaps
// and a bridge among what is under way.
TEST(StabilizerMain, ProgressMayEndItAnywhere) {
  synthetic::track_world_options options;
  options.frame_count = 120;
  options.slots = 60;
  options.hole = {70, 74};
  options.mean_life = 200;
  const synthetic::track_world world = make_track_world(options);
  SolverParamsRecord parameters = params_1080p();
  parameters.duration = 20;
  parameters.max_factorization_frames = 40;
  parameters.factorization_window_overlap = 10;
  parameters.track_fade_duration = 20;
  struct cancelled {};
  const auto calls_until = [&](std::size_t stop) {
    stabilizer_global global = *world.global;
    std::vector<transition_record> transitions;
    std::vector<factorization_window> windows;
    std::size_t calls = 0;
    try {
      EXPECT_EQ(stabilizer_main(global, parameters, transitions, windows, 1920, 1080,
                                [&] {
                                  if (++calls == stop) throw cancelled();
                                }),
                1);
      EXPECT_GT(windows.size(), 2u);
      EXPECT_FALSE(transitions.empty());
    } catch (const cancelled&) {
      EXPECT_EQ(calls, stop);
    }
    return calls;
  };
  const std::size_t all = calls_until(0);
  EXPECT_GT(all, 1000u);
  for (std::size_t k = 0; k < 50; ++k) {
    const std::size_t stop = 1 + k * (all - 1) / 49;
    EXPECT_EQ(calls_until(stop), stop);
  }
}

}  // namespace
}  // namespace marrow::stabilization
