#include <benchmark/benchmark.h>

#include <cmath>
#include <random>
#include <vector>

#include "bench/side_by_side.h"
#include "stabilization/transitions/transitions.h"

// Cost of one transition and of one lockdown, by frames and by tracks alive at a time. Arguments:
// frames, tracks, mean life of a track in frames (0: the whole stretch). `ms` is this thread's own
// time for one.
namespace {

using namespace marrow::stabilization;

stabilizer_global shaky_tracks(int frames, int slots, int mean_life) {
  stabilizer_global global;
  global.frame_count = frames;
  global.feature_count = slots;
  global.input.assign(global.frame_count * global.feature_count, {0, 0, -1, 0});
  std::mt19937 random(3);
  std::uniform_real_distribution<double> x(100, 1800), y(100, 1000);
  std::normal_distribution<double> jitter(0, 6), noise(0, 0.1);
  std::vector<double> dx(frames), dy(frames), angle(frames);
  for (int f = 0; f < frames; ++f) {
    dx[f] = 2.0 * f + jitter(random);
    dy[f] = jitter(random);
    angle[f] = 5e-4 * jitter(random);
  }
  for (int s = 0; s < slots; ++s) {
    int left = 0;
    double px = 0, py = 0;
    for (int f = 0; f < frames; ++f) {
      const bool seed = left == 0;
      if (seed) {
        left =
            mean_life == 0 ? frames : 2 + std::geometric_distribution<int>(1.0 / mean_life)(random);
        px = x(random) + dx[f];
        py = y(random);
      }
      --left;
      global.input[f * global.feature_count + s] = {
          static_cast<float>(px - angle[f] * py - dx[f] + noise(random)),
          static_cast<float>(py + angle[f] * px - dy[f] + noise(random)), seed ? f + 1 : 0, 0};
    }
  }
  global.output.assign(global.input.size(), {0, 0, -1, 0});
  global.trajectories = marrow::tracking::BuildTrajectories(
      global.input.data(), global.feature_count, global.frame_count);
  return global;
}

template <class Solve>
void run(benchmark::State& state, const Solve& solve) {
  const int frames = static_cast<int>(state.range(0));
  const stabilizer_global fresh =
      shaky_tracks(frames, static_cast<int>(state.range(1)), static_cast<int>(state.range(2)));
  double spent = 0;
  for (auto _ : state) {
    state.PauseTiming();
    stabilizer_global global = fresh;
    std::vector<transition_record> records;
    state.ResumeTiming();
    const double begin = side_by_side::ThreadMilliseconds();
    solve(global, frames, records);
    spent += side_by_side::ThreadMilliseconds() - begin;
    for (const transition_record& record : records) {
      if (record.kind != transition_record::solved) state.SkipWithError("a stretch is unsolved");
    }
  }
  state.counters["ms"] = spent / static_cast<double>(state.iterations());
}

void BM_Transition(benchmark::State& state) {
  SolverParamsRecord parameters;
  parameters.transition_max_duration = state.range(0);
  run(state, [&](stabilizer_global& global, int frames, std::vector<transition_record>& records) {
    transition_window(global, 0, frames, parameters, 1920, 1080, false, records, [] {});
  });
  if (state.range(0) == 210 && state.range(1) == 500) state.counters["limit"] = 1000;
}

// The same stretch in chunks of the default 200 frames.
void BM_LongTransition(benchmark::State& state) {
  const SolverParamsRecord parameters;
  run(state, [&](stabilizer_global& global, int frames, std::vector<transition_record>& records) {
    transition_window(global, 0, frames, parameters, 1920, 1080, false, records, [] {});
  });
}

void BM_BundledTransition(benchmark::State& state) {
  SolverParamsRecord parameters;
  parameters.transition_max_duration = state.range(0);
  parameters.use_new_solver = false;
  run(state, [&](stabilizer_global& global, int frames, std::vector<transition_record>& records) {
    transition_window(global, 0, frames, parameters, 1920, 1080, false, records, [] {});
  });
}

void BM_Lockdown(benchmark::State& state) {
  const SolverParamsRecord parameters;
  run(state, [&](stabilizer_global& global, int frames, std::vector<transition_record>& records) {
    lockdown_window(global, 0, frames, parameters, {}, records, [] {});
  });
}

BENCHMARK(BM_Transition)
    ->ArgsProduct({{30, 100, 210}, {60, 200, 500}, {60}})
    ->Args({210, 500, 0})
    ->Unit(benchmark::kMillisecond);
BENCHMARK(BM_LongTransition)
    ->Args({1000, 200, 60})
    ->Args({4000, 200, 60})
    ->Unit(benchmark::kMillisecond);
BENCHMARK(BM_BundledTransition)
    ->Args({30, 60, 60})
    ->Args({210, 500, 60})
    ->Args({210, 500, 0})
    ->Unit(benchmark::kMillisecond);
BENCHMARK(BM_Lockdown)->Args({210, 500, 60})->Args({2000, 200, 60})->Unit(benchmark::kMillisecond);

}  // namespace
