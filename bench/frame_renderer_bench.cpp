#include "stabilizer/render/frame_renderer.h"
#include "stabilizer/render/output_rect.h"

#include <benchmark/benchmark.h>

#include <algorithm>
#include <boost/make_shared.hpp>
#include <chrono>
#include <cmath>
#include <ctime>
#include <opencv2/imgproc.hpp>
#include <random>

#include "platform/tessel/threads.h"

// Milliseconds a frame of renderFrame, cropped and enlarged, for a warp as a handheld clip has it:
// a few pixels of shift, half a degree, a bend of three pixels over a grid of 64 by 36. Beside it,
// turn by turn in the same run, cv::remap on one thread, bilinear, by a map that was made before:
// it neither finds positions nor weights by alpha, and its fractions have 5 bits.
// The counter `ratio` is ours to cv::remap, median to median. Arguments: width, height.
namespace {

using namespace marrow::render;
using marrow::stabilization::frame_bounds;
using marrow::stabilization::point2;
using marrow::stabilization::VarVector;

class Clip final : public ClipWarps {
 public:
  Clip(int width, int height) : width_(width), height_(height), warp_(64, 36) {
    for (int r = 0; r < warp_.rows; ++r) {
      for (int c = 0; c < warp_.cols; ++c) {
        const point2 p =
            To({c * (width - 1.0) / (warp_.cols - 1), r * (height - 1.0) / (warp_.rows - 1)});
        warp_.values[2 * (r * warp_.cols + c)] = p.x;
        warp_.values[2 * (r * warp_.cols + c) + 1] = p.y;
        bounds_ = {std::min(bounds_.min_x, p.x), std::min(bounds_.min_y, p.y),
                   std::max(bounds_.max_x, p.x), std::max(bounds_.max_y, p.y)};
      }
    }
  }
  std::size_t frameCount() const override { return 1; }
  boost::shared_ptr<const VarVector> frameWarp(std::size_t) const override {
    return boost::make_shared<const VarVector>(warp_);
  }
  bool warpedGridOfFrame(std::size_t, std::size_t, VarVector&) const override { return false; }
  frame_bounds unionBounds() const override { return bounds_; }
  std::int32_t frameWidth() const override { return width_; }
  std::int32_t frameHeight() const override { return height_; }
  std::int32_t gridCols() const override { return warp_.cols; }
  std::int32_t gridRows() const override { return warp_.rows; }

  point2 To(point2 s) const {
    const double x = s.x - width_ / 2.0, y = s.y - height_ / 2.0;
    return {width_ / 2.0 + x - 0.009 * y + 7.3 + 3 * std::sin(s.y / 150),
            height_ / 2.0 + y + 0.009 * x - 4.1 + 3 * std::sin(s.x / 200)};
  }
  point2 From(point2 p) const {
    point2 s = p;
    for (int i = 0; i < 12; ++i) {
      const point2 q = To(s);
      s = {s.x + p.x - q.x, s.y + p.y - q.y};
    }
    return s;
  }

 private:
  int width_, height_;
  VarVector warp_;
  frame_bounds bounds_{1e9, 1e9, -1e9, -1e9};
};

template <class Pixel>
struct depth;
template <>
struct depth<HX_Pixel8> {
  static constexpr int type = CV_8UC4;
  static constexpr double full = 255;
  static constexpr double rate = 1.5;  // wanted, in the peer's
};
template <>
struct depth<HX_Pixel16> {
  static constexpr int type = CV_16UC4;
  static constexpr double full = 32768;
  static constexpr double rate = 2.5;  // wanted, in the peer's
};
template <>
struct depth<HX_PixelFloat> {
  static constexpr int type = CV_32FC4;
  static constexpr double full = 1;
  static constexpr double rate = 1.3;  // wanted, in the peer's
};

template <class Pixel>
class Frame final : public SourceFrames<Pixel> {
 public:
  Frame(int width, int height) : world_(boost::make_shared<WorldX<Pixel>>(width, height)) {
    std::mt19937 random(1);
    cv::Mat noise(height, width, CV_32FC4);
    for (int y = 0; y < height; ++y) {
      for (int x = 0; x < 4 * width; ++x) {
        noise.ptr<float>(y)[x] = static_cast<float>(random() % 1024) / 1023.0f;
      }
    }
    cv::GaussianBlur(noise, noise, cv::Size(5, 5), 1.0);
    for (int y = 0; y < height; ++y) {
      for (int x = 0; x < width; ++x) noise.at<cv::Vec4f>(y, x)[0] = 1;  // opaque
    }
    noise.convertTo(image(), depth<Pixel>::type, depth<Pixel>::full);
  }
  boost::shared_ptr<const WorldX<Pixel>> fetch(std::size_t) override { return world_; }
  cv::Mat image() {
    return cv::Mat(world_->height(), world_->width(), depth<Pixel>::type, world_->data());
  }

 private:
  boost::shared_ptr<WorldX<Pixel>> world_;
};

// A cropped frame asks for none.
template <class Pixel>
class NoOperations final : public WorldOperations<Pixel> {
 public:
  void TransferBehind(const WorldX<Pixel>&, int, int, WorldX<Pixel>&) override {}
  void Blur(const WorldX<Pixel>&, WorldX<Pixel>&, float) override {}
};

template <class Pixel>
struct Render {
  explicit Render(const benchmark::State& state)
      : width(static_cast<int>(state.range(0))),
        height(static_cast<int>(state.range(1))),
        clip(width, height),
        renderer(makeRenderer(clip, 1, 1)),
        source(width, height),
        crop(1, 1, 1),
        out(width, height) {
    // A window of 95 % in the middle of the frame.
    crop.cropWidth = width * 19 / 20;
    crop.cropHeight = height * 19 / 20;
    const float left = static_cast<float>(width / 40 - renderer.boundsMinX);
    const float top = static_cast<float>(height / 40 - renderer.boundsMinY);
    crop.rects[0] = {left, left + crop.cropWidth - 1, top, top + crop.cropHeight - 1};
  }

  void operator()() { renderFrame<Pixel>(clip, &crop, {}, renderer, 0, source, operations, out); }

  // Source position of every output pixel: the crop's centre goes to the output's.
  cv::Mat Map() {
    const double z = getZoom(clip, &crop, {}, renderer);
    const crop_rect& rect = crop.rects[0];
    cv::Mat map(height, width, CV_32FC2);
    for (int y = 0; y < height; ++y) {
      for (int x = 0; x < width; ++x) {
        const point2 s = clip.From(
            {(x - (width - 1) / 2.0) / z + (rect.left + rect.right) / 2.0 + renderer.boundsMinX,
             (y - (height - 1) / 2.0) / z + (rect.top + rect.bottom) / 2.0 + renderer.boundsMinY});
        map.at<cv::Vec2f>(y, x) = {static_cast<float>(s.x - 0.5), static_cast<float>(s.y - 0.5)};
      }
    }
    return map;
  }

  int width, height;
  Clip clip;
  Renderer renderer;
  Frame<Pixel> source;
  NoOperations<Pixel> operations;
  cropper crop;
  WorldX<Pixel> out;
};

// This thread's own time, so that a busy machine does not tell.
double Milliseconds() {
  timespec t;
  clock_gettime(CLOCK_THREAD_CPUTIME_ID, &t);
  return 1e3 * static_cast<double>(t.tv_sec) + 1e-6 * static_cast<double>(t.tv_nsec);
}

double Median(std::vector<double> values) {
  if (values.empty()) return 0;
  std::nth_element(values.begin(), values.begin() + values.size() / 2, values.end());
  return values[values.size() / 2];
}

template <class Pixel>
void OneProcessorBesideRemap(benchmark::State& state) {
  cv::setNumThreads(1);
  const tessel::threads::ProcessorLimit limit(1);
  Render<Pixel> render(state);
  const cv::Mat map = render.Map();
  cv::Mat remapped;
  std::vector<double> ours, theirs;
  for (auto _ : state) {
    const double begin = Milliseconds();
    render();
    const double middle = Milliseconds();
    cv::remap(render.source.image(), remapped, map, cv::noArray(), cv::INTER_LINEAR);
    const double end = Milliseconds();
    ours.push_back(middle - begin);
    theirs.push_back(end - middle);
    state.SetIterationTime(ours.back() / 1e3);
  }
  const cv::Mat drawn(render.height, render.width, depth<Pixel>::type, render.out.data());
  const double difference = cv::norm(drawn, remapped, cv::NORM_L1) /
                            (4.0 * render.width * render.height * depth<Pixel>::full);
  if (!(difference < 0.005)) state.SkipWithError("the two pictures are not the same");
  state.counters["remap_ms"] = Median(theirs);
  state.counters["ratio"] = Median(ours) / Median(theirs);
  if (render.width == 1920) state.counters["limit"] = 1 / depth<Pixel>::rate;
}

// Wall time of a render on two threads to that on one, turn by turn: tells something where two are
// free. A limit just raised leaves the other thread asleep for a render or so, hence the first.
template <class Pixel>
void TwoProcessorsBesideOne(benchmark::State& state) {
  constexpr int kRenders = 10;
  Render<Pixel> render(state);
  const auto seconds = [&](int processors) {
    const tessel::threads::ProcessorLimit limit(processors);
    render();
    const auto begin = std::chrono::steady_clock::now();
    for (int i = 0; i < kRenders; ++i) render();
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - begin).count() /
           kRenders;
  };
  std::vector<double> one, two;
  for (auto _ : state) {
    one.push_back(seconds(1));
    two.push_back(seconds(2));
    state.SetIterationTime(two.back());
  }
  state.counters["ratio"] = Median(two) / Median(one);
  state.counters["limit"] = 1 / 1.8;
}

template <class Pixel>
void AllProcessors(benchmark::State& state) {
  Render<Pixel> render(state);
  for (auto _ : state) render();
}

#define FRAME_SIZES Args({1280, 720})->Args({1920, 1080})->Unit(benchmark::kMillisecond)
BENCHMARK(OneProcessorBesideRemap<HX_Pixel8>)->FRAME_SIZES->UseManualTime();
BENCHMARK(OneProcessorBesideRemap<HX_Pixel16>)->FRAME_SIZES->UseManualTime();
BENCHMARK(OneProcessorBesideRemap<HX_PixelFloat>)->FRAME_SIZES->UseManualTime();
BENCHMARK(TwoProcessorsBesideOne<HX_Pixel8>)
    ->Args({1920, 1080})
    ->Unit(benchmark::kMillisecond)
    ->UseManualTime();
BENCHMARK(AllProcessors<HX_Pixel8>)->FRAME_SIZES->UseRealTime();
BENCHMARK(AllProcessors<HX_Pixel16>)->FRAME_SIZES->UseRealTime();
BENCHMARK(AllProcessors<HX_PixelFloat>)->FRAME_SIZES->UseRealTime();

}  // namespace
