#include "stabilizer/render/edge_synthesis.h"

#include <benchmark/benchmark.h>

#include <algorithm>
#include <boost/make_shared.hpp>
#include <chrono>
#include <cmath>
#include <random>

#include "host/pixels/world_operations.h"
#include "platform/tessel/threads.h"
#include "stabilizer/render/frame_renderer.h"
#include "stabilizer/render/output_rect.h"

// Milliseconds a frame, on one processor, whose edges are filled from 15 neighbours on each side,
// in a shot whose frames lie up to `shake` pixels off their place and are turned by up to half a
// degree. Beside it, turn by turn in the same run, the same frame drawn alone, without preparation.
// The counter `renders` is how many of these it takes, median to median, where a plain loop takes
// 31 and 30 compositions; `prepare` and `compose` are the milliseconds that go into preparing
// sources and into the host's transfers. Arguments: width, height, shake.
namespace {

using namespace marrow::render;
using marrow::stabilization::frame_bounds;
using marrow::stabilization::VarVector;

constexpr int kRange = 15;

class Shot final : public ClipWarps {
 public:
  Shot(int width, int height, int shake) : width_(width), height_(height) {
    std::mt19937 random(5);
    std::uniform_real_distribution<double> place(-shake, shake), turn(-0.009, 0.009);
    for (int f = 0; f < 2 * kRange + 1; ++f) {
      const double dx = place(random), dy = place(random), angle = turn(random);
      VarVector warp(64, 36);
      for (int i = 0; i < warp.cols * warp.rows; ++i) {
        const double x = i % warp.cols * (width - 1.0) / (warp.cols - 1) - width / 2.0;
        const double y = i / warp.cols * (height - 1.0) / (warp.rows - 1) - height / 2.0;
        const double px = width / 2.0 + x - angle * y + dx, py = height / 2.0 + y + angle * x + dy;
        warp.values[2 * i] = px;
        warp.values[2 * i + 1] = py;
        bounds_ = {std::min(bounds_.min_x, px), std::min(bounds_.min_y, py),
                   std::max(bounds_.max_x, px), std::max(bounds_.max_y, py)};
      }
      warps_.push_back(warp);
    }
  }
  std::size_t frameCount() const override { return warps_.size(); }
  boost::shared_ptr<const VarVector> frameWarp(std::size_t frame) const override {
    return boost::make_shared<const VarVector>(warps_[frame]);
  }
  bool warpedGridOfFrame(std::size_t M, std::size_t, VarVector& warp) const override {
    warp = warps_[M];
    return true;
  }
  frame_bounds unionBounds() const override { return bounds_; }
  std::int32_t frameWidth() const override { return width_; }
  std::int32_t frameHeight() const override { return height_; }
  std::int32_t gridCols() const override { return 64; }
  std::int32_t gridRows() const override { return 36; }

 private:
  int width_, height_;
  std::vector<VarVector> warps_;
  frame_bounds bounds_{1e9, 1e9, -1e9, -1e9};
};

double Now() {
  return std::chrono::duration<double, std::milli>(
             std::chrono::steady_clock::now().time_since_epoch())
      .count();
}

// A few frames, opaque, as a cache would hold them.
template <class Pixel>
class Frames final : public SourceFrames<Pixel> {
 public:
  Frames(int width, int height) {
    std::mt19937 random(1);
    using Channel = decltype(Pixel::red);
    const double full = world_view<Pixel>::full;
    for (auto& world : worlds_) {
      world = boost::make_shared<WorldX<Pixel>>(width, height);
      for (int y = 0; y < height; ++y) {
        for (int x = 0; x < width; ++x) {
          const auto value = static_cast<Channel>(full * (random() % 1024) / 1023.0);
          world->row(y)[x] = {world_view<Pixel>::full, value, value, value};
        }
      }
    }
  }
  boost::shared_ptr<const WorldX<Pixel>> fetch(std::size_t frame) override {
    return worlds_[frame % std::size(worlds_)];
  }

 private:
  boost::shared_ptr<WorldX<Pixel>> worlds_[4];
};

template <class Pixel>
class TimedOperations final : public WorldOperations<Pixel> {
 public:
  void TransferBehind(const WorldX<Pixel>& from, int x, int y, WorldX<Pixel>& to) override {
    const double begin = Now();
    HX_World target = world_of(to);
    calmframe::host::Transfer(world_of(from), kBehind, x, y, target);
    spent += Now() - begin;
  }
  void Blur(const WorldX<Pixel>&, WorldX<Pixel>&, float) override {}  // no frame is deblurred
  double spent = 0;
};

double Median(std::vector<double> values) {
  if (values.empty()) return 0;
  std::nth_element(values.begin(), values.begin() + values.size() / 2, values.end());
  return values[values.size() / 2];
}

template <class Pixel>
void SynthesisBesideRenders(benchmark::State& state) {
  const int width = static_cast<int>(state.range(0)), height = static_cast<int>(state.range(1));
  const tessel::threads::ProcessorLimit limit(1);
  const Shot shot(width, height, static_cast<int>(state.range(2)));
  Renderer renderer = makeRenderer(shot, 1, 1);
  Frames<Pixel> frames(width, height);
  TimedOperations<Pixel> operations;
  RenderSettings alone, filled;
  alone.framing = Framing::stabilize_only;
  filled.framing = Framing::synthesize_edges;
  filled.synthesis_range = kRange;
  filled.edges.feather = 10;
  filled.alpha_boost = 5;
  WorldX<Pixel> out(renderer.planeWidth, renderer.planeHeight), prepared(width, height);
  std::vector<double> synthesis, render;
  double preparing = 0;
  for (auto _ : state) {
    const double begin = Now();
    renderFrame<Pixel>(shot, nullptr, filled, renderer, kRange, frames, operations, out);
    const double middle = Now();
    renderFrame<Pixel>(shot, nullptr, alone, renderer, kRange, frames, operations, out);
    const double end = Now();
    for (int i = 0; i < 2 * kRange + 1; ++i) {
      prepareEdges(*frames.fetch(i), scaledEdges(filled.edges, 1), prepared);
    }
    preparing += Now() - end;
    synthesis.push_back(middle - begin);
    render.push_back(end - middle);
    state.SetIterationTime(synthesis.back() / 1e3);
  }
  const auto runs = static_cast<double>(synthesis.size());
  state.counters["render_ms"] = Median(render);
  state.counters["renders"] = Median(synthesis) / Median(render);
  state.counters["prepare"] = preparing / runs;
  state.counters["compose"] = operations.spent / runs;
}

#define SHOTS \
  Args({1920, 1080, 30})->Args({1920, 1080, 100})->Unit(benchmark::kMillisecond)->UseManualTime()
BENCHMARK(SynthesisBesideRenders<HX_Pixel8>)->SHOTS;
BENCHMARK(SynthesisBesideRenders<HX_Pixel16>)->SHOTS;
BENCHMARK(SynthesisBesideRenders<HX_PixelFloat>)->SHOTS;

}  // namespace
