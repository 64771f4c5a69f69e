#include "tracking/frame_preparation.h"

#include <benchmark/benchmark.h>

#include <opencv2/imgproc.hpp>
#include <random>
#include <vector>

// Milliseconds a frame of each conversion, ours (fast), a plain loop, and OpenCV's nearest call on
// one thread. Arguments: width, height.
namespace marrow::tracking {
namespace {

struct Input {
  explicit Input(const benchmark::State& state)
      : width(state.range(0)), height(state.range(1)), bytes(4 * width * height) {
    std::mt19937 random(1);
    for (auto& b : bytes) b = random() & 255;
    cv::setNumThreads(1);
  }
  ArgbFrame frame() const {
    return {bytes.data(), static_cast<std::ptrdiff_t>(4 * width), width, height};
  }
  std::size_t width, height;
  std::vector<std::uint8_t> bytes;
};

void LumaFast(benchmark::State& state) {
  const Input in(state);
  std::vector<std::uint8_t> out(in.width * in.height);
  for (auto _ : state) {
    LumaFromArgb(in.frame(), out.data());
    benchmark::ClobberMemory();
  }
}

void LumaPlain(benchmark::State& state) {
  const Input in(state);
  std::vector<std::uint8_t> out(in.width * in.height);
  for (auto _ : state) {
    for (std::size_t i = 0; i < out.size(); ++i) {
      const std::uint8_t* p = &in.bytes[4 * i];
      out[i] = static_cast<std::uint8_t>((9798 * p[1] + 19235 * p[2] + 3735 * p[3] + 16384) >> 15);
    }
    benchmark::ClobberMemory();
  }
}

// The channel order does not matter for the time.
void LumaOpenCv(benchmark::State& state) {
  Input in(state);
  const cv::Mat source(in.height, in.width, CV_8UC4, in.bytes.data());
  cv::Mat grey;
  for (auto _ : state) {
    cv::cvtColor(source, grey, cv::COLOR_RGBA2GRAY);
    benchmark::ClobberMemory();
  }
}

void MaskFast(benchmark::State& state) {
  const Input in(state);
  std::vector<std::uint8_t> out(in.width * in.height);
  for (auto _ : state) {
    MaskFromArgb(in.frame(), out.data());
    benchmark::ClobberMemory();
  }
}

void MaskPlain(benchmark::State& state) {
  const Input in(state);
  std::vector<std::uint8_t> out(in.width * in.height);
  for (auto _ : state) {
    for (std::size_t i = 0; i < out.size(); ++i) out[i] = in.bytes[4 * i] > 127 ? 1 : 0;
    benchmark::ClobberMemory();
  }
}

void ColorFast(benchmark::State& state) {
  const Input in(state);
  std::vector<float> out(3 * in.width * in.height);
  for (auto _ : state) {
    ColorFromArgb(in.frame(), out.data());
    benchmark::ClobberMemory();
  }
}

void ColorPlain(benchmark::State& state) {
  const Input in(state);
  std::vector<float> out(3 * in.width * in.height);
  for (auto _ : state) {
    for (std::size_t i = 0; i < in.width * in.height; ++i) {
      for (int c = 0; c < 3; ++c) out[3 * i + c] = in.bytes[4 * i + 1 + c];
    }
    benchmark::ClobberMemory();
  }
}

void ColorOpenCv(benchmark::State& state) {
  Input in(state);
  const cv::Mat source(in.height, in.width, CV_8UC4, in.bytes.data());
  cv::Mat three, out;
  for (auto _ : state) {
    cv::cvtColor(source, three, cv::COLOR_RGBA2RGB);
    three.convertTo(out, CV_32F);
    benchmark::ClobberMemory();
  }
}

#define FRAME_SIZES Args({1280, 720})->Args({1920, 1080})->Unit(benchmark::kMillisecond)
BENCHMARK(LumaFast)->FRAME_SIZES;
BENCHMARK(LumaPlain)->FRAME_SIZES;
BENCHMARK(LumaOpenCv)->FRAME_SIZES;
BENCHMARK(MaskFast)->FRAME_SIZES;
BENCHMARK(MaskPlain)->FRAME_SIZES;
BENCHMARK(ColorFast)->FRAME_SIZES;
BENCHMARK(ColorPlain)->FRAME_SIZES;
BENCHMARK(ColorOpenCv)->FRAME_SIZES;

}  // namespace
}  // namespace marrow::tracking
