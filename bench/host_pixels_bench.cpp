#include <benchmark/benchmark.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <opencv2/imgproc.hpp>
#include <random>
#include <vector>

#include "host/pixels/world_buffer.h"
#include "host/pixels/world_operations.h"

// Milliseconds of the host's Gaussian on a frame of 1920 by 1080. Beside it, turn by turn in the
// same run, cv::GaussianBlur of the same sigma, size and edges, on as many threads; at 8 bits it
// computes in fixed point. The counter `ratio` is ours to OpenCV's, median to median. Arguments:
// bits of a component, radius.
namespace {

using namespace calmframe::host;

double Milliseconds(const auto& work) {
  const auto start = std::chrono::steady_clock::now();
  work();
  return std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - start)
      .count();
}

double Median(std::vector<double> values) {
  std::nth_element(values.begin(), values.begin() + values.size() / 2, values.end());
  return values[values.size() / 2];
}

void BM_Blur(benchmark::State& state) {
  const int depth = static_cast<int>(state.range(0));
  const auto radius = static_cast<float>(state.range(1));
  constexpr int kWidth = 1920, kHeight = 1080;
  const std::uint32_t format = FormatOfDepth(depth);
  WorldBuffer from(kWidth, kHeight, format), to(kWidth, kHeight, format);
  const int type = depth == 8 ? CV_8UC4 : depth == 16 ? CV_16UC4 : CV_32FC4;
  cv::Mat peer_from(kHeight, kWidth, type, from.world().data), peer_to;
  std::mt19937 random(1);
  for (int y = 0; y < kHeight; ++y) {
    for (int i = 0; i < 4 * kWidth; ++i) {
      const auto value = random() % 256;
      if (depth == 8) from.row<std::uint8_t>(y)[i] = static_cast<std::uint8_t>(value);
      if (depth == 16) from.row<std::uint16_t>(y)[i] = static_cast<std::uint16_t>(128 * value);
      if (depth == 32) from.row<float>(y)[i] = static_cast<float>(value) / 255.0f;
    }
  }
  const double sigma = radius / 2;
  const int side = 2 * static_cast<int>(std::ceil(3 * sigma)) + 1;
  std::vector<double> ours, theirs;
  for (auto _ : state) {
    ours.push_back(Milliseconds([&] {
      if (Blur(from.world(), to.world(), radius) != HX_ERR_NONE) state.SkipWithError("no blur");
    }));
    theirs.push_back(Milliseconds([&] {
      cv::GaussianBlur(peer_from, peer_to, {side, side}, sigma, sigma, cv::BORDER_REPLICATE);
    }));
    state.SetIterationTime(ours.back() / 1e3);
  }
  state.counters["ms"] = Median(ours);
  state.counters["peer_ms"] = Median(theirs);
  state.counters["ratio"] = Median(ours) / Median(theirs);
}

BENCHMARK(BM_Blur)
    ->ArgsProduct({{8, 16, 32}, {3, 9, 40}})
    ->UseManualTime()
    ->Unit(benchmark::kMillisecond);

}  // namespace
