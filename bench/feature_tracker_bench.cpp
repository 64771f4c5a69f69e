#include "tracking/feature_tracker.h"

#include <benchmark/benchmark.h>

#include <algorithm>
#include <cmath>
#include <opencv2/imgproc.hpp>
#include <opencv2/video/tracking.hpp>
#include <random>
#include <vector>

#include "tracking/feature_selector.h"

// Time of the tracker on 500 features of a frame that moved by a sub-pixel shift and dimmed a
// little, beside OpenCV's calcOpticalFlowPyrLK on one thread with the same window, levels and
// points. Ours tracks three channels of floats, OpenCV one of bytes (Grey) or three (Colour).
// Counters: each, processor time a feature; tracked, features that were found; off, median
// distance from their true places. Arguments: width, height.
namespace marrow::tracking {
namespace {

constexpr std::size_t kFeatures = 500;
constexpr double kShiftX = 2.3, kShiftY = -1.6;

// Blocks of random brightness with sensor noise, softened by about a pixel as a lens would, at a
// sub-pixel shift.
cv::Mat Colours(std::size_t width, std::size_t height, double dx, double dy, double gain) {
  std::mt19937 random(1);
  const int w = static_cast<int>(width), h = static_cast<int>(height);
  cv::Mat image(h, w, CV_32FC3, cv::Scalar(100, 110, 90));
  for (std::size_t i = 0; i < width * height / 600; ++i) {
    const cv::Point corner(random() % width, random() % height);
    const cv::Size size(4 + random() % 60, 4 + random() % 60);
    const cv::Scalar colour(30 + random() % 200, 30 + random() % 200, 30 + random() % 200);
    cv::rectangle(image, cv::Rect(corner, size), colour, cv::FILLED);
  }
  cv::GaussianBlur(image, image, cv::Size(5, 5), 1.0);
  const cv::Matx23d shift(1, 0, dx, 0, 1, dy);
  cv::warpAffine(image, image, shift, image.size(), cv::INTER_CUBIC, cv::BORDER_REPLICATE);
  cv::Mat noise(h, w, CV_32FC3);
  cv::RNG(gain > 0.99 ? 7 : 8).fill(noise, cv::RNG::NORMAL, 0.0, 1.0);
  cv::Mat bytes;
  cv::Mat(image * gain + noise).convertTo(bytes, CV_8UC3);
  return bytes;
}

struct Clip {
  explicit Clip(const benchmark::State& state)
      : width(state.range(0)),
        height(state.range(1)),
        first(Colours(width, height, 0, 0, 1.0)),
        second(Colours(width, height, kShiftX, kShiftY, 0.97)),
        previous(Pyramid(first)),
        current(Pyramid(second)) {
    cv::setNumThreads(1);
    SelectorParams selector_params;
    selector_params.max_count = kFeatures;
    selector_params.half_winx = selector_params.half_winy = half();
    selector_params.spacing = height >= 1080 ? 29 : 19;
    selector_params.border = half() + 5;
    selector_params.threshold = 0.01f;
    FeatureSelector selector(selector_params);
    selector.Configure(width, height);
    cv::Mat grey;
    cv::cvtColor(first, grey, cv::COLOR_RGB2GRAY);
    grey.convertTo(cv::Mat(grey.size(), CV_8U, selector.luma()), CV_8U);
    std::fill_n(selector.mask(), width * height, std::uint8_t{1});
    selector.ComputeCandidates();
    selector.SelectFirst();
    for (const auto& f : selector.selected) seeds.push_back({f.x, f.y, 1, 0});
    params.half_win_x = params.half_win_y = half();
    statistics.translation.resize(params.pyramidal_levels + 1);
    statistics.verification.resize(params.pyramidal_levels + 1);
  }
  std::size_t half() const { return height >= 1080 ? 15 : 10; }

  static ImagePyramid Pyramid(const cv::Mat& bytes) {
    ImagePyramid pyramid(bytes.cols, bytes.rows, 3, 5);
    bytes.convertTo(cv::Mat(bytes.size(), CV_32FC3, pyramid.LevelData(0)), CV_32FC3);
    BuildLevels(pyramid);
    return pyramid;
  }

  void Track(FeatureTracker& tracker, std::vector<tracking_feature<float>>& row) {
    tracker.TrackAndVerify(previous, current, seeds.data(), row.data(), seeds.size(), statistics);
  }

  std::size_t width, height;
  cv::Mat first, second;
  ImagePyramid previous, current;
  std::vector<tracking_feature<float>> seeds;
  TrackerParams params;
  TrackingStatistics statistics;
};

// Distances from the seeds' true places.
void Report(benchmark::State& state, std::size_t seeds, std::vector<double> off) {
  std::sort(off.begin(), off.end());
  state.counters["each"] =
      benchmark::Counter(static_cast<double>(seeds), benchmark::Counter::kIsIterationInvariantRate |
                                                         benchmark::Counter::kInvert);
  state.counters["features"] = static_cast<double>(seeds);
  state.counters["tracked"] = static_cast<double>(off.size());
  state.counters["off"] = off.empty() ? -1.0 : off[off.size() / 2];
  if (2 * off.size() < seeds) state.SkipWithError("most features were lost");
}

void ReportRow(benchmark::State& state, const Clip& clip,
               const std::vector<tracking_feature<float>>& row) {
  std::vector<double> off;
  for (std::size_t s = 0; s < clip.seeds.size(); ++s) {
    if (row[s].status != 0) continue;
    off.push_back(
        std::hypot(row[s].x - clip.seeds[s].x - kShiftX, row[s].y - clip.seeds[s].y - kShiftY));
  }
  Report(state, clip.seeds.size(), off);
}

// Without verification.
void Translation(benchmark::State& state) {
  Clip clip(state);
  clip.params.affine_verification = false;
  FeatureTracker tracker(clip.params, clip.seeds.size(), 3);
  std::vector<tracking_feature<float>> row(clip.seeds.size());
  for (auto _ : state) clip.Track(tracker, row);
  ReportRow(state, clip, row);
}

// Of seeds whose matrices were formed in a frame before, as for all but a track's first frame. The
// warp that is found stays: an iteration goes on from where the last one ended.
void TranslationAndVerification(benchmark::State& state) {
  Clip clip(state);
  FeatureTracker tracker(clip.params, clip.seeds.size(), 3);
  tracker.InitialiseSeeds(clip.previous, clip.seeds.data());
  std::vector<tracking_feature<float>> row(clip.seeds.size());
  for (auto _ : state) clip.Track(tracker, row);
  ReportRow(state, clip, row);
}

void SeedsAndTheirFirstFrame(benchmark::State& state) {
  Clip clip(state);
  FeatureTracker tracker(clip.params, clip.seeds.size(), 3);
  std::vector<tracking_feature<float>> row(clip.seeds.size());
  for (auto _ : state) {
    tracker.InitialiseSeeds(clip.previous, clip.seeds.data());
    clip.Track(tracker, row);
  }
  ReportRow(state, clip, row);
}

// A frame's whole step but for selection: pyramid, translation, verification.
void TrackingStep(benchmark::State& state) {
  Clip clip(state);
  FeatureTracker tracker(clip.params, clip.seeds.size(), 3);
  tracker.InitialiseSeeds(clip.previous, clip.seeds.data());
  std::vector<tracking_feature<float>> row(clip.seeds.size());
  for (auto _ : state) {
    BuildLevels(clip.current);
    clip.Track(tracker, row);
  }
  ReportRow(state, clip, row);
}

template <bool kGrey>
void OpticalFlowOpenCv(benchmark::State& state) {
  const Clip clip(state);
  cv::Mat first = clip.first, second = clip.second;
  if (kGrey) {
    cv::cvtColor(clip.first, first, cv::COLOR_RGB2GRAY);
    cv::cvtColor(clip.second, second, cv::COLOR_RGB2GRAY);
  }
  std::vector<cv::Point2f> from, to;
  for (const auto& seed : clip.seeds) from.emplace_back(seed.x, seed.y);
  const int side = static_cast<int>(2 * clip.half() + 1);
  const cv::TermCriteria stop(cv::TermCriteria::COUNT | cv::TermCriteria::EPS, 25, 0.1);
  std::vector<unsigned char> found;
  for (auto _ : state) {
    cv::calcOpticalFlowPyrLK(first, second, from, to, found, cv::noArray(), cv::Size(side, side), 4,
                             stop);
  }
  std::vector<double> off;
  for (std::size_t s = 0; s < from.size(); ++s) {
    if (found[s] == 0) continue;
    off.push_back(std::hypot(to[s].x - from[s].x - kShiftX, to[s].y - from[s].y - kShiftY));
  }
  Report(state, from.size(), off);
}

#define FRAME_SIZES Args({1280, 720})->Args({1920, 1080})->Unit(benchmark::kMillisecond)
BENCHMARK(OpticalFlowOpenCv<true>)->FRAME_SIZES;
BENCHMARK(OpticalFlowOpenCv<false>)->FRAME_SIZES;
BENCHMARK(TrackingStep)->FRAME_SIZES;
BENCHMARK(Translation)->FRAME_SIZES;
BENCHMARK(TranslationAndVerification)->FRAME_SIZES;
BENCHMARK(SeedsAndTheirFirstFrame)->FRAME_SIZES;

}  // namespace
}  // namespace marrow::tracking
