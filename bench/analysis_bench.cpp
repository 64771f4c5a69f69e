#include <benchmark/benchmark.h>
#include <malloc.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <limits>
#include <memory>
#include <opencv2/imgproc.hpp>
#include <opencv2/video/tracking.hpp>
#include <vector>

#include "analysis/effect/analysis_parameter_rules.h"
#include "bench/side_by_side.h"
#include "host/media/clip.h"
#include "synthetic/scene.h"
#include "tests/support/parameter_values.h"
#include "tracking/color_pyramid.h"
#include "tracking/feature_selector.h"
#include "tracking/feature_tracker.h"
#include "tracking/frame_images.h"
#include "tracking/image_pyramid.h"
#include "tracking/tracking_run.h"

// The analysis of a frame, stage by stage and whole, beside what OpenCV does for the same end, both
// on one thread and turn by turn. Each row's counter `ratio` is ours to the peer, median to median;
// `limit` is what it should not exceed. Frames: a street of 1920 x 1080 as a walker's camera sees
// it, or the first ones of the clip that CALMFRAME_BENCH_CLIP names. They stand in memory: decoding
// has a thread of its own.
namespace {

using namespace marrow::tracking;
using side_by_side::Compare;

constexpr std::size_t kFrames = 8;
constexpr std::size_t kRun = 60;  // frames of a whole analysis: the same, there and back
constexpr std::size_t kLevels = 5;

struct Frames final {
  std::size_t width = 0, height = 0;
  std::vector<std::vector<HX_Pixel8>> pixels;
  std::vector<cv::Mat> grey;

  ArgbFrame Argb(std::size_t f) const {
    return {reinterpret_cast<const std::uint8_t*>(pixels[f].data()),
            static_cast<std::ptrdiff_t>(4 * width), width, height};
  }
  cv::Mat Mat(std::size_t f) const {  // channels in ARGB order
    return cv::Mat(static_cast<int>(height), static_cast<int>(width), CV_8UC4,
                   const_cast<HX_Pixel8*>(pixels[f].data()));
  }
};

Frames StreetFrames() {
  synthetic::scene_options options;
  options.width = 1920;
  options.height = 1080;
  options.frame_count = kFrames;
  options.noise = 2.0;
  options.gain = 0.02;
  const synthetic::scene scene(synthetic::street(1), synthetic::handheld_path({}), options);
  Frames frames{1920, 1080, {}, {}};
  for (std::size_t f = 0; f < kFrames; ++f) {
    frames.pixels.push_back(scene.render(static_cast<int>(f)));
  }
  return frames;
}

Frames ClipFrames(const char* path) {
  const auto reader = calmframe::media::ClipReader::Open(path);
  Frames frames;
  frames.width = static_cast<std::size_t>(reader->info().width);
  frames.height = static_cast<std::size_t>(reader->info().height);
  for (std::size_t f = 0; f < std::min(kFrames, reader->info().frame_count); ++f) {
    frames.pixels.emplace_back(frames.width * frames.height);
    reader->Read(f, frames.pixels.back().data(), static_cast<std::ptrdiff_t>(4 * frames.width));
  }
  return frames;
}

const Frames& Input() {
  static const Frames frames = [] {
    cv::setNumThreads(1);
    // What either has freed stays at hand. By default it depends on the sizes that others have
    // freed before whether OpenCV's images come fresh, page by page, from the system each time.
    mallopt(M_MMAP_THRESHOLD, 1 << 30);
    mallopt(M_TRIM_THRESHOLD, std::numeric_limits<int>::max());
    const char* path = std::getenv("CALMFRAME_BENCH_CLIP");
    Frames made = path ? ClipFrames(path) : StreetFrames();
    for (std::size_t f = 0; f < made.pixels.size(); ++f) {
      LumaFromArgb(made.Argb(f), made.grey.emplace_back(made.Mat(f).size(), CV_8U).data);
    }
    return made;
  }();
  return frames;
}

kelp::effect::ParameterValues ValuesOf(bool detailed) {
  kelp::effect::ParameterValues values;
  values[kelp::effect::kDetailedAnalysisIndex] = detailed;
  return values;
}

SelectorParams SelectorOf(bool detailed) {
  return kelp::analysis::effect::GetSelectorParams(ValuesOf(detailed),
                                                   static_cast<std::uint32_t>(Input().width),
                                                   static_cast<std::uint32_t>(Input().height));
}

TrackerParams TrackerOf(bool detailed) {
  return kelp::analysis::effect::GetTrackerParams(ValuesOf(detailed),
                                                  static_cast<std::uint32_t>(Input().height));
}

std::size_t FrameOfRun(std::size_t t) {
  const std::size_t last = Input().pixels.size() - 1;
  if (last == 0) return 0;
  const std::size_t place = t % (2 * last);
  return place <= last ? place : 2 * last - place;
}

class MemorySource final : public FrameSource {
 public:
  std::size_t width() const override { return Input().width; }
  std::size_t height() const override { return Input().height; }
  std::size_t frame_count() const override { return kRun; }
  void LoadLuma(std::size_t t, std::uint8_t* out) override { images_.Luma(t, Frame(t), out); }
  void LoadMask(std::size_t t, std::uint8_t* out) override { images_.Mask(t, Frame(t), out); }
  void LoadColor(std::size_t t, float* out) override { ColorFromArgb(Frame(t), out); }
  ImagePyramid::first_level first_level() const override {
    return ImagePyramid::first_level::bytes;
  }
  void LoadColorPyramid(std::size_t t, ImagePyramid& pyramid,
                        std::vector<float>& scratch) override {
    images_.ColorPyramid(t, Frame(t), pyramid, scratch);
  }

 private:
  static ArgbFrame Frame(std::size_t t) { return Input().Argb(FrameOfRun(t)); }

  FrameImages images_;
};

void SelectCandidates(std::size_t frame, FeatureSelector& selector) {
  LumaFromArgb(Input().Argb(frame), selector.luma());
  MaskFromArgb(Input().Argb(frame), selector.mask());
  selector.ComputeCandidates();
  selector.SelectFirst();
}

void GoodFeatures(const cv::Mat& grey, const SelectorParams& params,
                  std::vector<cv::Point2f>& corners) {
  cv::goodFeaturesToTrack(grey, corners, static_cast<int>(params.max_count), params.threshold,
                          static_cast<double>(params.spacing), cv::noArray(),
                          static_cast<int>(2 * params.half_winx + 1));
}

void OpticalFlow(const cv::Mat& from, const cv::Mat& to, const TrackerParams& params,
                 const std::vector<cv::Point2f>& points, std::vector<cv::Point2f>& moved,
                 std::vector<unsigned char>& found) {
  const int side = static_cast<int>(2 * params.half_win_x + 1);
  cv::calcOpticalFlowPyrLK(
      from, to, points, moved, found, cv::noArray(), cv::Size(side, side), kLevels - 1,
      cv::TermCriteria(cv::TermCriteria::COUNT | cv::TermCriteria::EPS,
                       static_cast<int>(params.max_iterations), params.tolerance_translation));
}

// Luma, mask, colour and the levels of three channels, beside OpenCV's float RGB and a pyramid of
// one channel, of floats (which has the more to do) or of bytes.
template <int kPeerDepth>
void Preparation(benchmark::State& state) {
  const Frames& in = Input();
  std::vector<float> scratch;
  std::vector<std::uint8_t> luma(in.width * in.height), mask(in.width * in.height);
  ImagePyramid pyramid(in.width, in.height, 3, kLevels, ImagePyramid::first_level::bytes);
  FrameImages images;
  cv::Mat rgb, colour, single;
  in.grey[0].convertTo(single, kPeerDepth);
  std::vector<cv::Mat> levels;
  std::size_t f = 0;
  const auto frame = [&] { return f++ / 2 % in.pixels.size(); };
  Compare(
      state, 1.5, 1,
      [&] {
        const ArgbFrame argb = in.Argb(frame());
        images.ColorPyramid(f, argb, pyramid, scratch);
        images.Luma(f, argb, luma.data());
        images.Mask(f, argb, mask.data());
      },
      [&] {
        cv::cvtColor(in.Mat(frame()), rgb, cv::COLOR_RGBA2RGB);
        rgb.convertTo(colour, CV_32F);
        cv::buildPyramid(single, levels, kLevels - 1);
      });
}

void Selector(benchmark::State& state) {
  const Frames& in = Input();
  const SelectorParams params = SelectorOf(false);
  FeatureSelector selector(params);
  selector.Configure(in.width, in.height);
  MaskFromArgb(in.Argb(0), selector.mask());
  LumaFromArgb(in.Argb(0), selector.luma());
  std::vector<cv::Point2f> corners;
  Compare(
      state, 0.5, 1,
      [&] {
        selector.ComputeCandidates();
        selector.SelectFirst();
      },
      [&] { GoodFeatures(in.grey[0], params, corners); });
  state.counters["selected"] = static_cast<double>(selector.selected.size());
  state.counters["peer_selected"] = static_cast<double>(corners.size());
}

// 500 features of frame 0 and the first two pyramids.
struct Step {
  explicit Step(bool verified)
      : params(TrackerOf(false)), tracker(Verified(verified), SelectorOf(false).max_count, 3) {
    const Frames& in = Input();
    FeatureSelector selector(SelectorOf(false));
    selector.Configure(in.width, in.height);
    SelectCandidates(0, selector);
    for (const auto& s : selector.selected) seeds.push_back({s.x, s.y, 1, 0.0f});
    seeds.resize(SelectorOf(false).max_count, {0.0f, 0.0f, feature_status::kEmpty, 0.0f});
    for (const auto& seed : seeds) {
      if (seed.status > 0) points.emplace_back(seed.x, seed.y);
    }
    std::vector<float> scratch;
    std::vector<std::uint8_t> luma(in.width * in.height);
    for (std::size_t f = 0; f < 2; ++f) {
      pyramids.emplace_back(in.width, in.height, std::size_t{3}, kLevels,
                            ImagePyramid::first_level::bytes);
      ColorPyramidFromArgb(in.Argb(f), pyramids[f], scratch, luma.data());
    }
    statistics.translation.resize(kLevels + 1);
    statistics.verification.resize(kLevels + 1);
    moved = seeds;
  }
  static TrackerParams Verified(bool verified) {
    TrackerParams params = TrackerOf(false);
    params.affine_verification = verified;
    return params;
  }
  void Track() {
    tracker.TrackAndVerify(pyramids[0], pyramids[1], seeds.data(), moved.data(), seeds.size(),
                           statistics);
  }
  void Peer() {
    OpticalFlow(Input().grey[0], Input().grey[1], params, points, moved_points, found);
  }
  void Report(benchmark::State& state) const {
    state.counters["features"] = static_cast<double>(points.size());
    state.counters["tracked"] = static_cast<double>(std::count_if(
        moved.begin(), moved.end(), [](const auto& cell) { return cell.status == 0; }));
    state.counters["peer_tracked"] =
        static_cast<double>(std::count(found.begin(), found.end(), static_cast<unsigned char>(1)));
  }

  TrackerParams params;
  FeatureTracker tracker;
  std::vector<tracking_feature<float>> seeds, moved;
  std::vector<ImagePyramid> pyramids;
  TrackingStatistics statistics;
  std::vector<cv::Point2f> points, moved_points;
  std::vector<unsigned char> found;
};

void Translation(benchmark::State& state) {
  Step step(false);
  Compare(
      state, 0.6, 1, [&] { step.Track(); }, [&] { step.Peer(); });
  step.Report(state);
}

// With the matrices of a feature's first frame already formed, and from the warp found last, as in
// all frames but a feature's first.
void TranslationAndVerification(benchmark::State& state) {
  Step step(true);
  step.tracker.InitialiseSeeds(step.pyramids[0], step.seeds.data());
  Compare(
      state, 1.8, 1, [&] { step.Track(); }, [&] { step.Peer(); });
  step.Report(state);
}

double LiveCells(const AllFeatures& table) {
  return static_cast<double>(std::count_if(table.features->begin(), table.features->end(),
                                           [](const auto& cell) { return cell.status >= 0; })) /
         table.frame_count;
}

AllFeatures Track(bool detailed) {
  MemorySource source;
  AllFeatures table;
  TrackFrames(source, SelectorOf(detailed), TrackerOf(detailed), table);
  return table;
}

void WholeAnalysis(benchmark::State& state) {
  const Frames& in = Input();
  AllFeatures table;
  std::vector<cv::Point2f> corners, moved;
  std::vector<unsigned char> found;
  Compare(
      state, 0.55, kRun, [&] { table = Track(false); },
      [&] {
        for (std::size_t t = 0; t < kRun; ++t) {
          const cv::Mat& grey = in.grey[FrameOfRun(t)];
          if (t > 0) {
            OpticalFlow(in.grey[FrameOfRun(t - 1)], grey, TrackerOf(false), corners, moved, found);
          }
          GoodFeatures(grey, SelectorOf(false), corners);
        }
      });
  state.counters["live"] = LiveCells(table);
}

// Ours to ours: detailed analysis, which has 2,000 slots and windows of 41 x 41, beside the default
// with 500 and 31 x 31.
void DetailedAnalysis(benchmark::State& state) {
  AllFeatures table;
  Compare(
      state, 3.5, kRun, [&] { table = Track(true); }, [] { Track(false); });
  state.counters["live"] = LiveCells(table);
}

#define ROW Unit(benchmark::kMillisecond)->UseManualTime()
BENCHMARK(Preparation<CV_32F>)->ROW->Iterations(41);
BENCHMARK(Preparation<CV_8U>)->ROW->Iterations(41);
BENCHMARK(Selector)->ROW->Iterations(41);
BENCHMARK(Translation)->ROW->Iterations(41);
BENCHMARK(TranslationAndVerification)->ROW->Iterations(41);
BENCHMARK(WholeAnalysis)->ROW->Iterations(3);
BENCHMARK(DetailedAnalysis)->ROW->Iterations(3);

}  // namespace
