#include "tracking/feature_selector.h"

#include <benchmark/benchmark.h>

#include <algorithm>
#include <cmath>
#include <opencv2/imgproc.hpp>
#include <random>
#include <vector>

#include "tracking/score_maxima.h"

// Milliseconds a frame of the selector, whole and by stages, beside plain passes over whole images
// and OpenCV's goodFeaturesToTrack on one thread with the same window, spacing and count.
// Arguments: width, height. The half window is the automatic one for the height.
namespace marrow::tracking {
namespace {

SelectorParams Params(const benchmark::State& state) {
  SelectorParams params;
  params.half_winx = params.half_winy = state.range(1) >= 1080 ? 15 : 10;
  params.spacing = state.range(1) >= 1080 ? 29 : 19;
  params.threshold = 0.01f;
  return params;
}

// Blocks of random brightness with sensor noise, softened by about a pixel as a lens would.
std::vector<std::uint8_t> Scene(std::size_t width, std::size_t height) {
  std::mt19937 random(1);
  cv::Mat image(height, width, CV_32F, cv::Scalar(100));
  for (std::size_t i = 0; i < width * height / 600; ++i) {
    const cv::Point corner(random() % width, random() % height);
    const cv::Size size(4 + random() % 60, 4 + random() % 60);
    cv::rectangle(image, cv::Rect(corner, size), cv::Scalar(random() % 256), cv::FILLED);
  }
  cv::GaussianBlur(image, image, cv::Size(5, 5), 1.0);
  std::vector<std::uint8_t> luma(image.begin<float>(), image.end<float>());
  for (auto& v : luma) v = std::min<unsigned>(255, v + random() % 4);
  return luma;
}

std::vector<float> FloatScene(std::size_t width, std::size_t height) {
  const std::vector<std::uint8_t> scene = Scene(width, height);
  return {scene.begin(), scene.end()};
}

struct Selector {
  explicit Selector(const benchmark::State& state)
      : scene(Scene(state.range(0), state.range(1))), selector(Params(state)) {
    selector.Configure(state.range(0), state.range(1));
    std::fill_n(selector.mask(), scene.size(), std::uint8_t{1});
    std::copy(scene.begin(), scene.end(), selector.luma());
  }
  std::vector<std::uint8_t> scene;
  FeatureSelector selector;
};

void WholeSelector(benchmark::State& state) {
  Selector s(state);
  for (auto _ : state) {
    s.selector.ComputeCandidates();
    s.selector.SelectFirst();
  }
  state.counters["candidates"] = s.selector.candidates.size();
  state.counters["selected"] = s.selector.selected.size();
}

void SelectionOnly(benchmark::State& state) {
  Selector s(state);
  s.selector.ComputeCandidates();
  for (auto _ : state) s.selector.SelectFirst();
}

void Presmoothing(benchmark::State& state) {
  const SelectorParams params = Params(state);
  const std::size_t w = state.range(0), h = state.range(1);
  const std::vector<std::uint8_t> image = Scene(w, h);
  SeparableSmoother smoother(IntegratedGaussian((2.0 * params.half_winx + 1) * 0.1), w, 24);
  for (auto _ : state) {
    smoother.Start(image.data(), w, {0, 0, w, h});
    for (std::size_t y = 0; y < h; ++y) benchmark::DoNotOptimize(smoother.Row(y));
  }
}

void PresmoothingOpenCv(benchmark::State& state) {
  cv::setNumThreads(1);
  const SelectorParams params = Params(state);
  const std::vector<float> luma = FloatScene(state.range(0), state.range(1));
  cv::Mat image(state.range(1), state.range(0), CV_32F, const_cast<float*>(luma.data()));
  const std::vector<float> kernel = IntegratedGaussian((2.0 * params.half_winx + 1) * 0.1);
  cv::Mat out;
  for (auto _ : state) {
    cv::sepFilter2D(image, out, CV_32F, kernel, kernel, cv::Point(-1, -1), 0, cv::BORDER_REPLICATE);
  }
}

// Gradient sums and scores, and with their maxima.
template <bool kMaxima>
void Scores(benchmark::State& state) {
  const SelectorParams params = Params(state);
  const std::size_t w = state.range(0), h = state.range(1), inset = params.half_winx + 1;
  const std::vector<std::uint8_t> scene = Scene(w, h);
  SeparableSmoother unsmoothed({1.0f}, w, h);
  unsmoothed.Start(scene.data(), w, {0, 0, w, h});
  unsmoothed.Row(h - 1);
  const RowFolding& folding = unsmoothed.folding();
  GradientSums sums(params.half_winx, params.half_winy, w);
  const std::size_t stride = FoldedStride(folding.positions() + 2);
  memory::LineAlignedVector<float> scores(3 * stride);
  std::vector<score_maximum> maxima;
  for (auto _ : state) {
    sums.Start([&](std::size_t y) { return unsmoothed.Row(y); }, w, inset, h - 2 * inset);
    maxima.clear();
    for (std::size_t y = 0; y < h - 2 * inset; ++y) {
      const auto row = [&](std::size_t r) {
        return &scores[r % 3 * stride + RowFolding::kSegments];
      };
      sums.NextScores(params.eig_ratio_threshold, row(y));
      if (kMaxima) FillHalo(row(y), folding.positions(), 1, 0.0f, 0.0f);
      if (kMaxima && y > 1) {
        FindMaxima(row(y - 2), row(y - 1), row(y), folding, inset, w - inset - 1, 441.0f, maxima);
      }
      benchmark::ClobberMemory();
    }
  }
}

// Window sums over planes of products, running along rows and then along columns.
void PlainSumsAndScores(benchmark::State& state) {
  const SelectorParams params = Params(state);
  const std::size_t w = state.range(0), h = state.range(1), half = params.half_winx;
  const std::vector<float> image = FloatScene(w, h);
  std::vector<float> planes[3], score(w * h), line(w * h);
  for (auto& plane : planes) plane.resize(w * h);
  for (auto _ : state) {
    for (std::size_t y = 1; y + 1 < h; ++y) {
      for (std::size_t i = y * w + 1; i + 1 < (y + 1) * w; ++i) {
        const float ix = image[i + 1] - image[i - 1], iy = image[i + w] - image[i - w];
        planes[0][i] = ix * ix;
        planes[1][i] = iy * iy;
        planes[2][i] = ix * iy;
      }
    }
    for (auto& plane : planes) {
      for (std::size_t y = 0; y < h; ++y) {
        double sum = 0;
        for (std::size_t x = 0; x < w; ++x) {
          sum += plane[y * w + x];
          if (x > 2 * half) sum -= plane[y * w + x - 2 * half - 1];
          if (x >= 2 * half) line[y * w + x - half] = static_cast<float>(sum);
        }
      }
      for (std::size_t x = half; x + half < w; ++x) {
        double sum = 0;
        for (std::size_t y = 0; y < h; ++y) {
          sum += line[y * w + x];
          if (y > 2 * half) sum -= line[(y - 2 * half - 1) * w + x];
          if (y >= 2 * half) plane[(y - half) * w + x] = static_cast<float>(sum);
        }
      }
    }
    for (std::size_t y = half + 1; y + half + 1 < h; ++y) {
      for (std::size_t x = half + 1; x + half + 1 < w; ++x) {
        const std::size_t i = y * w + x;
        const float a = planes[0][i], b = planes[1][i], c = planes[2][i], t = a + b;
        const float d = std::sqrt(std::max(0.0f, t * t - 4 * (a * b - c * c)));
        score[i] = t + d > (t - d) * params.eig_ratio_threshold ? 0 : t - d;
      }
    }
    benchmark::DoNotOptimize(score.data());
  }
}

// Takes bytes, as trackers give them to it; without presmoothing, and with a blur of the same
// kernel.
template <bool kSmooth>
void GoodFeaturesToTrackOpenCv(benchmark::State& state) {
  cv::setNumThreads(1);
  const SelectorParams params = Params(state);
  const std::vector<float> luma = FloatScene(state.range(0), state.range(1));
  const cv::Mat image(state.range(1), state.range(0), CV_32F, const_cast<float*>(luma.data()));
  const std::vector<float> kernel = IntegratedGaussian((2.0 * params.half_winx + 1) * 0.1);
  cv::Mat bytes, smooth;
  image.convertTo(bytes, CV_8U);
  std::vector<cv::Point2f> corners;
  for (auto _ : state) {
    if (kSmooth) cv::sepFilter2D(image, smooth, CV_32F, kernel, kernel);
    cv::goodFeaturesToTrack(kSmooth ? smooth : bytes, corners, params.max_count, params.threshold,
                            params.spacing, cv::noArray(), 2 * params.half_winx + 1);
  }
  state.counters["selected"] = corners.size();
}

#define FRAME_SIZES Args({1280, 720})->Args({1920, 1080})->Unit(benchmark::kMillisecond)
BENCHMARK(WholeSelector)->FRAME_SIZES;
BENCHMARK(GoodFeaturesToTrackOpenCv<false>)->FRAME_SIZES;
BENCHMARK(GoodFeaturesToTrackOpenCv<true>)->FRAME_SIZES;
BENCHMARK(Presmoothing)->FRAME_SIZES;
BENCHMARK(PresmoothingOpenCv)->FRAME_SIZES;
BENCHMARK(Scores<false>)->FRAME_SIZES;
BENCHMARK(Scores<true>)->FRAME_SIZES;
BENCHMARK(PlainSumsAndScores)->FRAME_SIZES;
BENCHMARK(SelectionOnly)->FRAME_SIZES;

}  // namespace
}  // namespace marrow::tracking
