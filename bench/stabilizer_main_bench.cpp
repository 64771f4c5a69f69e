#include "stabilization/stabilizer_main.h"

#include <benchmark/benchmark.h>

#include <algorithm>
#include <boost/make_shared.hpp>
#include <chrono>
#include <ctime>
#include <fstream>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "bench/side_by_side.h"
#include "stabilization/crop/cropper.h"
#include "stabilization/factorization/factorization_queue.h"
#include "stabilization/smoothing/smooth_windows.h"
#include "stabilization/warp/cp_warper.h"
#include "stabilizer/effect/src/parameter_rules.h"
#include "stabilizer/effect/src/solver.h"
#include "synthetic/track_world.h"
#include "tests/support/parameter_values.h"

// Cost of a solve by its stages, on tracks of a lively scene at 1080p with a mean life of 60
// frames. Arguments: frames, slots. A stage's counter is its processor time in milliseconds; all of
// them should grow with the frames alone.
//
// Peak memory is the whole process's: run one size at a time, by --benchmark_filter, to read it.
namespace {

using namespace marrow::stabilization;
using clock_type = std::chrono::steady_clock;

constexpr std::uint32_t kWidth = 1920, kHeight = 1080;

SolverParamsRecord Params() {
  return kelp::effect::GetSolverParams(kelp::effect::ParameterValues(), {kWidth, kHeight}, 25);
}

// The tracks alone; what the world knows besides is dropped, so that it does not count as memory.
const marrow::tracking::AllFeatures& Table(std::int64_t frames, std::int64_t slots) {
  static std::pair<std::int64_t, std::int64_t> size;
  static marrow::tracking::AllFeatures table;
  if (size != std::pair(frames, slots)) {
    synthetic::track_world_options options;
    options.frame_count = static_cast<int>(frames);
    options.slots = static_cast<int>(slots);
    table = make_track_world(options).features;
    size = {frames, slots};
  }
  return table;
}

// Forgets the peak so far, as the making of a world needs more than some solves; nothing happens
// where the kernel has no such switch.
void ResetPeak() {
  std::ofstream("/proc/self/clear_refs") << 5;
}

double PeakMegabytes() {
  std::ifstream status("/proc/self/status");
  for (std::string word; status >> word;) {
    double kilobytes = 0;
    if (word == "VmHWM:" && status >> kilobytes) return kilobytes / 1024;
  }
  return 0;
}

double Seconds(clock_type::time_point begin) {
  return std::chrono::duration<double>(clock_type::now() - begin).count();
}

double ProcessorMilliseconds() {
  return 1000.0 * static_cast<double>(std::clock()) / CLOCKS_PER_SEC;
}

// The time that each stage takes, and the longest stretch of it between two progress calls, which
// is what a cancellation may have to wait for. In milliseconds of processor time.
class StageClock {
 public:
  struct Stage {
    double spent = 0;
    double longest_stretch = 0;
  };

  // Ends the stage since the last call or the clock's making.
  void End(const std::string& name) {
    Poll();
    const double now = ProcessorMilliseconds();
    stages[name].spent += now - begin_;
    stages[name].longest_stretch = std::max(stages[name].longest_stretch, stretch_);
    begin_ = last_ = now;
    stretch_ = 0;
  }
  progress_functor Progress() {
    return [this] { Poll(); };
  }

  std::map<std::string, Stage> stages;

 private:
  void Poll() {
    const double now = ProcessorMilliseconds();
    stretch_ = std::max(stretch_, now - last_);
    last_ = now;
  }

  double begin_ = ProcessorMilliseconds();
  double last_ = begin_;
  double stretch_ = 0;
};

void BM_Stages(benchmark::State& state) {
  const marrow::tracking::AllFeatures& table = Table(state.range(0), state.range(1));
  const SolverParamsRecord parameters = Params();
  std::map<std::string, StageClock::Stage> stages;
  ResetPeak();
  for (auto _ : state) {
    StageClock clock;
    const progress_functor progress = clock.Progress();
    auto global = boost::make_shared<stabilizer_global>();
    FillStabilizerGlobal(*global, static_cast<std::uint64_t>(table.feature_count),
                         static_cast<std::uint64_t>(table.frame_count), table, 1.0f);
    global->trajectories = marrow::tracking::BuildTrajectories(
        global->input.data(), global->feature_count, global->frame_count);
    std::erase_if(global->trajectories,
                  [&](const auto& t) { return t.last - t.first < parameters.min_duration; });
    clock.End("1 trajectories");
    std::vector<factorization_window> windows;
    std::vector<transition_record> transitions;
    factorize_windows(*global, parameters, windows, progress);
    clock.End("2 factorization");
    const std::vector<double> lambdas(global->frame_count, parameters.smoothness_lambda);
    if (!smooth_windows(*global, transitions, windows, lambdas, parameters, kWidth, kHeight,
                        progress)) {
      state.SkipWithError("a window's linear solve failed");
      break;
    }
    clock.End("3 windows");
    CPWarper warper(table.frame_count, kWidth, kHeight);
    warper.buildDisplacements(global, windows, transitions, parameters, progress);
    clock.End("4 displacements");
    warper.drive(progress);
    clock.End("5 warps");
    benchmark::DoNotOptimize(
        RunCropper(parameters, static_cast<std::size_t>(table.frame_count), warper, progress));
    clock.End("6 crop");
    stages = clock.stages;
    state.counters["windows"] = static_cast<double>(windows.size());
    state.counters["peak_MB"] = PeakMegabytes();
  }
  for (const auto& [name, stage] : stages) {
    state.counters[name] = stage.spent;
    state.counters[name + ", stretch"] = stage.longest_stretch;
  }
  state.SetItemsProcessed(state.iterations() * state.range(0));
}

// stabilizer_main alone; `ms` is this thread's own time for one.
void BM_Solve(benchmark::State& state) {
  const marrow::tracking::AllFeatures& table = Table(state.range(0), state.range(1));
  const SolverParamsRecord parameters = Params();
  ResetPeak();
  const double begin = side_by_side::ThreadMilliseconds();
  for (auto _ : state) {
    stabilizer_global global;
    FillStabilizerGlobal(global, static_cast<std::uint64_t>(table.feature_count),
                         static_cast<std::uint64_t>(table.frame_count), table, 1.0f);
    std::vector<factorization_window> windows;
    std::vector<transition_record> transitions;
    if (!stabilizer_main(global, parameters, transitions, windows, kWidth, kHeight, [] {})) {
      state.SkipWithError("every rank failed");
      break;
    }
    state.counters["peak_MB"] = PeakMegabytes();
  }
  state.counters["ms"] =
      (side_by_side::ThreadMilliseconds() - begin) / static_cast<double>(state.iterations());
  if (state.range(0) == 300 && state.range(1) == 500) state.counters["limit"] = 250;
  state.SetItemsProcessed(state.iterations() * state.range(0));
}

// How long a Solver takes to be dropped, at 50 points spread evenly over its length: the longest
// and the mean, in milliseconds. The time given is that of all 50 solves and says little.
void BM_Drop(benchmark::State& state) {
  const marrow::tracking::AllFeatures& table = Table(state.range(0), state.range(1));
  const auto start = [&] {
    auto solver = std::make_unique<Solver>(kWidth, kHeight, table, 0, Params(), true);
    solver->Start();
    return solver;
  };
  for (auto _ : state) {
    auto begin = clock_type::now();
    start()->Wait();
    const double whole = Seconds(begin);
    double longest = 0, sum = 0, worst_point = 0;
    for (int i = 0; i < 50; ++i) {
      begin = clock_type::now();
      auto solver = start();
      const double point = whole * (i + 0.5) / 50;
      solver->WaitFor(std::chrono::milliseconds(static_cast<std::int64_t>(1000 * point)));
      const auto drop = clock_type::now();
      solver.reset();
      const double taken = Seconds(drop);
      sum += taken;
      if (taken > longest) {
        longest = taken;
        worst_point = point / whole;
      }
    }
    state.counters["longest_ms"] = 1000 * longest;
    state.counters["longest_at_share"] = worst_point;
    state.counters["mean_ms"] = 1000 * sum / 50;
  }
}

void Sizes(benchmark::internal::Benchmark* b) {
  for (const int frames : {100, 300, 1000, 3000, 10000}) b->Args({frames, 500});
  b->Args({1000, 2000});
  b->Unit(benchmark::kMillisecond);
}

BENCHMARK(BM_Solve)->Apply(Sizes);
BENCHMARK(BM_Stages)->Apply(Sizes);
BENCHMARK(BM_Drop)->Args({1000, 500})->Iterations(1)->Unit(benchmark::kMillisecond);

}  // namespace
