#include "tracking/image_pyramid.h"

#include <benchmark/benchmark.h>

#include <algorithm>

#include <opencv2/imgproc.hpp>
#include <random>
#include <vector>

// Milliseconds a frame of five levels of three channels: ours (fast), plain loops, and OpenCV's
// buildPyramid (5 by 5 taps where ours has 3 along x) on one thread. Arguments: width, height.
namespace marrow::tracking {
namespace {

constexpr std::size_t kLevels = 5;

ImagePyramid Input(const benchmark::State& state) {
  ImagePyramid pyramid(state.range(0), state.range(1), 3, kLevels);
  std::mt19937 random(1);
  std::generate_n(pyramid.data.begin(), 3 * pyramid.width * pyramid.height,
                  [&] { return static_cast<float>(random() & 255); });
  return pyramid;
}

void BuildLevelsFast(benchmark::State& state) {
  ImagePyramid pyramid = Input(state);
  for (auto _ : state) {
    BuildLevels(pyramid);
    benchmark::ClobberMemory();
  }
}

void BuildLevelsPlain(benchmark::State& state) {
  ImagePyramid pyramid = Input(state);
  std::vector<float> scratch(3 * pyramid.width * pyramid.height);
  for (auto _ : state) {
    for (std::size_t l = 1; l < kLevels; ++l) {
      const std::size_t w = pyramid.LevelWidth(l - 1), h = pyramid.LevelHeight(l - 1);
      const std::size_t dw = pyramid.LevelWidth(l), dh = pyramid.LevelHeight(l);
      const float* s = pyramid.LevelData(l - 1);
      float* out = pyramid.LevelData(l);
      for (std::size_t y = 0; y < h; ++y) {
        for (std::size_t x = 1; x + 1 < dw; ++x) {
          for (std::size_t c = 0; c < 3; ++c) {
            const float* p = s + (y * w + 2 * x) * 3 + c;
            scratch[(y * dw + x) * 3 + c] = (p[-3] + 2.0f * p[0] + p[3]) * 0.25f;
          }
        }
      }
      for (std::size_t y = 1; y + 1 < dh; ++y) {
        std::copy_n(&scratch[(2 * y * dw + 1) * 3], (dw - 2) * 3, out + (y * dw + 1) * 3);
      }
    }
    benchmark::ClobberMemory();
  }
}

void BuildPyramidOpenCv(benchmark::State& state) {
  cv::setNumThreads(1);
  ImagePyramid pyramid = Input(state);
  const cv::Mat source(pyramid.height, pyramid.width, CV_32FC3, pyramid.data.data());
  std::vector<cv::Mat> levels;
  for (auto _ : state) {
    cv::buildPyramid(source, levels, kLevels - 1);
    benchmark::ClobberMemory();
  }
}

#define FRAME_SIZES Args({1280, 720})->Args({1920, 1080})->Unit(benchmark::kMillisecond)
BENCHMARK(BuildLevelsFast)->FRAME_SIZES;
BENCHMARK(BuildLevelsPlain)->FRAME_SIZES;
BENCHMARK(BuildPyramidOpenCv)->FRAME_SIZES;

}  // namespace
}  // namespace marrow::tracking
