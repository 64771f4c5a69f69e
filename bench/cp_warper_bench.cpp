// What a frame costs the warper at 1920 x 1080: its fits, its grid solve, and the whole drive, for
// as many displacements as the first argument says; drive's second one is the
// model. BuildDisplacements and Drive take 10 frames at a time.
#include "stabilization/warp/cp_warper.h"

#include <benchmark/benchmark.h>

#include <algorithm>
#include <boost/make_shared.hpp>
#include <cmath>
#include <ctime>
#include <random>

#include "platform/dss/dss.h"
#include "platform/lapack/lapack.h"
#include "stabilization/models/robust_pass.h"
#include "stabilization/warp/grid_solver.h"

namespace marrow::stabilization {
namespace {

constexpr int kWidth = 1920, kHeight = 1080, kFrames = 10;

// Still tracks over the whole clip that want to follow a wave of 3 px.
boost::shared_ptr<stabilizer_global> wavy_clip(int tracks) {
  auto global = boost::make_shared<stabilizer_global>();
  global->feature_count = tracks;
  global->frame_count = kFrames;
  std::mt19937 random(1);
  std::uniform_real_distribution<float> unit(0, 1);
  for (int s = 0; s < tracks; ++s) global->trajectories.push_back({s, 0, 0, kFrames});
  for (int s = 0; s < tracks; ++s) {
    global->input.push_back({unit(random) * (kWidth - 1), unit(random) * (kHeight - 1), 0, 0});
  }
  for (int f = 1; f < kFrames; ++f) {
    for (int s = 0; s < tracks; ++s) global->input.push_back(global->input[s]);
  }
  for (const track_sample& p : global->input) {
    global->output.push_back({p.x + 3 * std::sin(p.y / 150), p.y + 3 * std::sin(p.x / 200), 0, 0});
  }
  return global;
}

boost::shared_ptr<CPWarper> built(const boost::shared_ptr<stabilizer_global>& global,
                                  float method) {
  auto warper = boost::make_shared<CPWarper>(kFrames, kWidth, kHeight);
  std::vector<factorization_window> windows(1);
  windows[0].end = kFrames;
  SolverParamsRecord parameters;
  parameters.method_level = method;
  warper->buildDisplacements(global, windows, {}, parameters, [] {});
  return warper;
}

void FitSimilarity(benchmark::State& state) {
  const auto list = built(wavy_clip(state.range(0)), 4)->displacements(0);
  for (auto _ : state) benchmark::DoNotOptimize(fitSimilarity(list));
}

void FitHomography(benchmark::State& state) {
  const auto list = built(wavy_clip(state.range(0)), 4)->displacements(0);
  homography_fitter fitter;
  for (auto _ : state) benchmark::DoNotOptimize(fitter.fit(list));
}

void RobustPass(benchmark::State& state) {
  auto list = built(wavy_clip(state.range(0)), 4)->displacements(0);
  for (auto _ : state) benchmark::DoNotOptimize(medianDeviation(list));
}

// Cells and fractions as the warper leaves them, and a base grid under a homography.
struct GridProblem {
  explicit GridProblem(int tracks) {
    auto warper = built(wavy_clip(tracks), 3);
    warper->drive([] {});
    list = warper->displacements(0);
    shape = warper->frameWarp(0)->values;
    solution.resize(shape.size());
  }
  std::vector<Displacement> list;
  std::vector<double> shape, solution;
};

void GridSolve(benchmark::State& state) {
  GridProblem p(state.range(0));
  grid_solver solver(64, 36);
  for (auto _ : state) {
    if (!solver.solve(p.list, p.shape, 1.0, p.solution)) state.SkipWithError("not solved");
  }
}

// This thread's own time, so that a busy machine does not tell.
double Seconds() {
  timespec t;
  clock_gettime(CLOCK_THREAD_CPUTIME_ID, &t);
  return static_cast<double>(t.tv_sec) + 1e-9 * static_cast<double>(t.tv_nsec);
}

double Median(std::vector<double> values) {
  if (values.empty()) return 0;
  std::nth_element(values.begin(), values.begin() + values.size() / 2, values.end());
  return values[values.size() / 2];
}

// Assembly, factorization and solve, turn by turn with LAPACK's banded factorization and solve
// alone of a matrix with that band, vertices counted along the grid's shorter side, its narrowest
// order. The counter `ratio` is ours to LAPACK's, median to median.
void GridSolveBesideBandedLapack(benchmark::State& state) {
  GridProblem p(state.range(0));
  grid_solver solver(64, 36);
  const int n = 2 * 64 * 36, off = 2 * 36 + 3, leading = off + 1, one = 1;
  std::vector<double> matrix(static_cast<std::size_t>(n) * leading, -0.01);
  for (int j = 0; j < n; ++j) matrix[static_cast<std::size_t>(j) * leading] = 4;
  std::vector<double> band(matrix.size()), x(n);
  std::vector<double> ours, theirs;
  for (auto _ : state) {
    const double begin = Seconds();
    if (!solver.solve(p.list, p.shape, 1.0, p.solution)) state.SkipWithError("not solved");
    ours.push_back(Seconds() - begin);
    state.SetIterationTime(ours.back());
    band = matrix;
    x.assign(x.size(), 1.0);
    int info = 0;
    const double begin_peer = Seconds();
    lapack::dpbtrf("L", &n, &off, band.data(), &leading, &info);
    if (info == 0) {
      lapack::dpbtrs("L", &n, &off, &one, band.data(), &leading, x.data(), &n, &info);
    }
    theirs.push_back(Seconds() - begin_peer);
    if (info != 0) state.SkipWithError("not factored");
  }
  state.counters["lapack_ms"] = 1e3 * Median(theirs);
  state.counters["ratio"] = Median(ours) / Median(theirs);
  state.counters["limit"] = 1.3;
}

// Another peer: factorization and solve alone, of a stand-in matrix with the grid's couplings, by a
// sparse Cholesky that has analysed its fill-reducing order once.
void SparseCholeskyOfThatSize(benchmark::State& state) {
  constexpr int kCols = 64, kRows = 36, n = 2 * kCols * kRows;
  std::vector<DssInt> starts = {1}, columns;
  std::vector<double> values;
  for (int i = 0; i < n; ++i) {
    const int v = i / 2, c = v % kCols, r = v / kCols;
    for (int j = i; j < std::min(i / 2 * 2 + 2 * kCols + 4, n); ++j) {
      const int dc = j / 2 % kCols - c, dr = j / 2 / kCols - r;
      if (dc < -1 || dc > 1 || dr > 1) continue;
      columns.push_back(j + 1);
      values.push_back(i == j ? 4 : -0.01);
    }
    starts.push_back(static_cast<DssInt>(columns.size()) + 1);
  }
  DssHandle handle = nullptr;
  dss_create(handle, MKL_DSS_DEFAULTS);
  if (dss_define_structure(handle, MKL_DSS_SYMMETRIC, starts.data(), n, n, columns.data(),
                           static_cast<DssInt>(columns.size())) != 0 ||
      dss_reorder(handle, MKL_DSS_DEFAULTS, nullptr) != 0) {
    state.SkipWithError("no structure");
  }
  std::vector<double> right(n, 1.0), x(n);
  for (auto _ : state) {
    if (dss_factor_real(handle, MKL_DSS_POSITIVE_DEFINITE, values.data()) != 0 ||
        dss_solve_real(handle, MKL_DSS_DEFAULTS, right.data(), 1, x.data()) != 0) {
      state.SkipWithError("not solved");
    }
  }
  dss_delete(handle, MKL_DSS_DEFAULTS);
}

void Drive(benchmark::State& state) {
  const auto global = wavy_clip(state.range(0));
  const float method = static_cast<float>(state.range(1));
  for (auto _ : state) {
    state.PauseTiming();
    auto warper = built(global, method);
    state.ResumeTiming();
    warper->drive([] {});
  }
}

void BuildDisplacements(benchmark::State& state) {
  const auto global = wavy_clip(state.range(0));
  for (auto _ : state) benchmark::DoNotOptimize(built(global, 4));
}

#define SIZES Arg(500)->Arg(2000)->Unit(benchmark::kMillisecond)
BENCHMARK(FitSimilarity)->SIZES;
BENCHMARK(FitHomography)->SIZES;
BENCHMARK(RobustPass)->SIZES;
BENCHMARK(GridSolve)->SIZES;
BENCHMARK(GridSolveBesideBandedLapack)->SIZES->UseManualTime();
BENCHMARK(SparseCholeskyOfThatSize)->Unit(benchmark::kMillisecond);
BENCHMARK(BuildDisplacements)->SIZES;
BENCHMARK(Drive)->ArgsProduct({{500, 2000}, {3, 4}})->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace marrow::stabilization
