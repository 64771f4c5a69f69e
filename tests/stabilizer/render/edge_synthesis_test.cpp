#include "stabilizer/render/edge_synthesis.h"

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <cmath>
#include <cstring>
#include <limits>
#include <map>
#include <random>
#include <set>

#include "stabilizer/render/frame_renderer.h"
#include "stabilizer/render/output_rect.h"
#include "tests/stabilizer/render/pixel_operations.h"

namespace marrow::render {
using stabilization::frame_bounds;
using stabilization::point2;
using stabilization::VarVector;

namespace {

// Frames whose meshes are moved, turned and bent; pairs may be without a motion.
class Shot final : public ClipWarps {
 public:
  Shot(int width, int height, int cols, int rows)
      : width_(width), height_(height), cols_(cols), rows_(rows) {}
  void Add(point2 shift, double turn = 0, double bend = 0, double scale = 1) {
    VarVector warp(cols_, rows_);
    for (int i = 0; i < cols_ * rows_; ++i) {
      const double x = scale * (i % cols_) * (width_ - 1.0) / (cols_ - 1);
      const double y = scale * (i / cols_) * (height_ - 1.0) / (rows_ - 1);
      const double px = x - turn * y + bend * std::sin(y / 9) + shift.x;
      const double py = y + turn * x + bend * std::sin(x / 7) + shift.y;
      warp.values[2 * i] = px;
      warp.values[2 * i + 1] = py;
      bounds_ = {std::min(bounds_.min_x, px), std::min(bounds_.min_y, py),
                 std::max(bounds_.max_x, px), std::max(bounds_.max_y, py)};
    }
    warps_.push_back(warp);
  }
  std::size_t frameCount() const override { return warps_.size(); }
  const VarVector& frameWarp(std::size_t frame) const override { return warps_[frame]; }
  bool warpedGridOfFrame(std::size_t M, std::size_t N, VarVector& warp) const override {
    EXPECT_NE(M, N);
    if (without_motion.count(M)) return false;
    warp = warps_[M];
    return true;
  }
  frame_bounds unionBounds() const override { return bounds_; }
  std::int32_t frameWidth() const override { return width_; }
  std::int32_t frameHeight() const override { return height_; }
  std::int32_t gridCols() const override { return cols_; }
  std::int32_t gridRows() const override { return rows_; }

  std::set<std::size_t> without_motion;

 private:
  int width_, height_, cols_, rows_;
  std::vector<VarVector> warps_;
  frame_bounds bounds_{1e9, 1e9, -1e9, -1e9};
};

template <class Pixel>
class Frames final : public SourceFrames<Pixel> {
 public:
  boost::shared_ptr<const WorldX<Pixel>> Fetch(std::size_t frame) override {
    asked.push_back(frame);
    if (frame == refused) throw std::int32_t{42};
    return worlds.at(frame);
  }
  std::vector<boost::shared_ptr<const WorldX<Pixel>>> worlds;
  std::vector<std::size_t> asked;
  std::size_t refused = 1000;
};

// Colours at random; alpha full, none, or in between in patches. Floats also hold what no picture
// should.
template <class Pixel>
boost::shared_ptr<WorldX<Pixel>> patches(int width, int height, unsigned seed, bool opaque) {
  const auto world = boost::make_shared<WorldX<Pixel>>(width, height);
  std::mt19937 random(seed);
  using Channel = decltype(Pixel::red);
  const auto full = world_view<Pixel>::full;
  const auto value = [&] { return static_cast<Channel>(full * (random() % 1000 / 999.0)); };
  for (int y = 0; y < height; ++y) {
    for (int x = 0; x < width; ++x) {
      Pixel& p = world->row(y)[x];
      p = {full, value(), value(), value()};
      const unsigned patch = ((x + seed) / 11 * 7 + y / 9 * 3 + seed) % 8;
      if (opaque || patch > 2) continue;
      p.alpha = patch == 0 ? Channel{0} : value();
      if constexpr (std::is_same_v<Channel, float>) {
        const Channel odd[] = {-0.25f, 1.5f, std::numeric_limits<float>::quiet_NaN()};
        if (patch == 2 && random() % 9 == 0) p.alpha = odd[random() % 3];
      }
    }
  }
  return world;
}

// Every pass in full.
template <class Pixel>
void plain_synthesis(const FramePass<Pixel>& pass, WorldX<Pixel>& output) {
  drawFrame(pass, pass.frame, output);
  const auto frame = static_cast<long>(pass.frame);
  for (long distance = 1; distance <= pass.settings.synthesis_range; ++distance) {
    for (const long M : {frame + distance, frame - distance}) {
      if (M < 0 || M >= static_cast<long>(pass.warps.frameCount())) continue;
      WorldX<Pixel> layer(output.width(), output.height());
      if (drawFrame(pass, static_cast<std::size_t>(M), layer)) {
        pass.operations.TransferBehind(layer, 0, 0, output);
      }
    }
  }
  const double n = std::floor(pass.settings.alpha_boost + 0.5);
  if (n < 2) return;
  const auto full = world_view<Pixel>::full;
  for (int y = 0; y < output.height(); ++y) {
    for (int x = 0; x < output.width(); ++x) {
      auto& alpha = output.row(y)[x].alpha;
      if (alpha < full) alpha = std::min<double>(n * alpha, full);
    }
  }
}

template <class Pixel>
class EdgeSynthesis : public testing::Test {};
using Depths = testing::Types<HX_Pixel8, HX_Pixel16, HX_PixelFloat>;
TYPED_TEST_SUITE(EdgeSynthesis, Depths);

TYPED_TEST(EdgeSynthesis, WhatIsNotDrawnWouldNotHaveShown) {
  std::mt19937 random(11);
  const auto within = [&](double a) { return a * (random() % 2001 / 1000.0 - 1); };
  PixelOperations<TypeParam> operations;
  for (int run = 0; run < 30; ++run) {
    SCOPED_TRACE(run);
    Shot shot(190, 140, 9, 7);
    Frames<TypeParam> bare;
    const bool opaque = run % 3 != 0;
    const double shake = run % 2 ? 40 : 6;
    for (int f = 0; f < 9; ++f) {
      shot.Add({within(shake), within(shake)}, within(0.05), within(3));
      bare.worlds.push_back(patches<TypeParam>(190, 140, 100 * run + f, opaque));
    }
    if (run % 4 == 0) shot.without_motion = {1, 5};
    Renderer renderer = makeRenderer(shot, 1, 1);
    RenderSettings settings;
    settings.framing = Framing::synthesize_edges;
    settings.synthesis_range = run % 5 == 0 ? 3 : 20;
    settings.additional_scale = run % 7 == 3 ? 0.7f : 1.0f;
    settings.alpha_boost = run % 4;
    const bool prepares = run % 3 != 1;
    if (prepares) settings.edges = {2.0 * (run % 2), 0, 3, 1, 4};
    // A part of the plane, in rows with padding.
    const int width = renderer.planeWidth - 20, height = renderer.planeHeight - 9;
    settings.shift_x = 15;
    settings.shift_y = 4;
    const std::ptrdiff_t row_bytes = sizeof(TypeParam) * (width + 3);
    std::vector<TypeParam> found_pixels((width + 3) * height, TypeParam{7, 7, 7, 7});
    std::vector<TypeParam> plain_pixels = found_pixels;
    WorldX<TypeParam> found(width, height, row_bytes, found_pixels.data());
    WorldX<TypeParam> expected(width, height, row_bytes, plain_pixels.data());
    const std::size_t frame = run < 2 ? 8 * run : random() % 9;

    bare.asked.clear();
    ASSERT_TRUE(
        renderFrame<TypeParam>(shot, nullptr, settings, renderer, frame, bare, operations, found));
    EXPECT_EQ(std::set<std::size_t>(bare.asked.begin(), bare.asked.end()).size(),
              bare.asked.size());

    Frames<TypeParam> prepared;
    for (const auto& world : bare.worlds) {
      const auto copy = boost::make_shared<WorldX<TypeParam>>(190, 140);
      prepareEdges(*world, scaledEdges(settings.edges, 1), *copy);
      prepared.worlds.push_back(copy);
    }
    expected.clear();
    plain_synthesis<TypeParam>({shot,
                                settings,
                                renderer,
                                prepared,
                                operations,
                                frame,
                                {0, renderer.planeWidth - 1.0f, 0, renderer.planeHeight - 1.0f},
                                settings.additional_scale},
                               expected);
    ASSERT_EQ(std::memcmp(found_pixels.data(), plain_pixels.data(), row_bytes * height), 0);
  }
}

// Frames of one colour each, moved sideways by whole pixels. A pixel at x shows the source half a
// pixel to the left of x - shift; the outermost column is repeated in the two pixels beside it.
class Stripes {
 public:
  static constexpr int kSide = 24;
  explicit Stripes(const std::vector<double>& shifts) : shot(kSide, kSide, 4, 4) {
    for (std::size_t f = 0; f < shifts.size(); ++f) {
      shot.Add({shifts[f], 0});
      const auto world = boost::make_shared<WorldX<HX_PixelFloat>>(kSide, kSide);
      for (int i = 0; i < kSide * kSide; ++i) world->data()[i] = {1, 0.1f * (f + 1), 0, 0};
      frames.worlds.push_back(world);
    }
    settings.framing = Framing::synthesize_edges;
    settings.synthesis_range = 10;
  }
  // The middle row.
  std::vector<HX_PixelFloat> Row(std::size_t frame) {
    Renderer renderer = makeRenderer(shot, 1, 1);
    WorldX<HX_PixelFloat> output(renderer.planeWidth, renderer.planeHeight);
    frames.asked.clear();
    EXPECT_TRUE(renderFrame<HX_PixelFloat>(shot, nullptr, settings, renderer, frame, frames,
                                           operations, output));
    const HX_PixelFloat* row = output.row(kSide / 2);
    return {row, row + output.width()};
  }
  // Which frame shows in a pixel; -1 for none.
  static int Shown(const HX_PixelFloat& p) {
    return p.alpha == 0 ? -1 : static_cast<int>(std::lround(p.red * 10)) - 1;
  }

  Shot shot;
  Frames<HX_PixelFloat> frames;
  PixelOperations<HX_PixelFloat> operations;
  RenderSettings settings;
};

TEST(EdgeSynthesisOrder, TheNearestFrameThatCoversAPixelShowsAndTheNextOneBeforeTheLast) {
  //             frame  0   1   2  3   4    5
  Stripes stripes({60, 30, 0, 30, 60, -30});
  const auto row = stripes.Row(2);  // plane from -30 on
  ASSERT_EQ(row.size(), 113u);      // 23 + 60 + 30
  EXPECT_EQ(Stripes::Shown(row[10]), 5);
  EXPECT_EQ(Stripes::Shown(row[27]), -1)
      << "between -30 + 23 and 0, but for the border's tolerance";
  EXPECT_EQ(Stripes::Shown(row[40]), 2);
  EXPECT_EQ(Stripes::Shown(row[70]), 3) << "not 1, which lies there too";
  EXPECT_EQ(Stripes::Shown(row[100]), 4) << "not 0";
  EXPECT_EQ(stripes.frames.asked, (std::vector<std::size_t>{2, 3, 1, 4, 0, 5}));

  stripes.shot.without_motion = {3};
  EXPECT_EQ(Stripes::Shown(stripes.Row(2)[70]), 1);
  stripes.shot.without_motion = {1, 3};
  EXPECT_EQ(Stripes::Shown(stripes.Row(2)[70]), -1);
  stripes.shot.without_motion.clear();

  stripes.settings.synthesis_range = 1;
  EXPECT_EQ(Stripes::Shown(stripes.Row(2)[100]), -1);
  EXPECT_EQ(stripes.frames.asked, (std::vector<std::size_t>{2, 3, 1}));
  stripes.settings.synthesis_range = 0;
  EXPECT_EQ(Stripes::Shown(stripes.Row(2)[70]), -1);

  // At the clip's ends only one side is there.
  stripes.settings.synthesis_range = 2;
  EXPECT_EQ(Stripes::Shown(stripes.Row(0)[70]), 1);
  EXPECT_EQ(stripes.frames.asked, (std::vector<std::size_t>{0, 1, 2}));
  EXPECT_EQ(Stripes::Shown(stripes.Row(5)[70]), 3);
  EXPECT_EQ(stripes.frames.asked, (std::vector<std::size_t>{5, 4, 3}));
}

TEST(EdgeSynthesisOrder, ANeighbourThatReachesNothingOpenIsNotFetched) {
  Shot shot(200, 200, 4, 4);
  Frames<HX_Pixel8> frames;
  shot.Add({0, 0});
  shot.Add({60, 60}, 0, 0, 0.3);  // in the middle of the frame
  shot.Add({30, 0});
  shot.Add({300, 0});  // far away
  for (int f = 0; f < 4; ++f) frames.worlds.push_back(patches<HX_Pixel8>(200, 200, f, true));
  Renderer renderer = makeRenderer(shot, 1, 1);
  RenderSettings settings;
  settings.framing = Framing::synthesize_edges;
  settings.synthesis_range = 3;
  PixelOperations<HX_Pixel8> operations;
  WorldX<HX_Pixel8> output(renderer.planeWidth - 150, renderer.planeHeight);
  settings.shift_x = 0;
  ASSERT_TRUE(
      renderFrame<HX_Pixel8>(shot, nullptr, settings, renderer, 0, frames, operations, output));
  EXPECT_EQ(frames.asked, (std::vector<std::size_t>{0, 2, 3}));
}

TEST(EdgeSynthesisOrder, NothingIsFetchedForAClosedPicture) {
  Stripes stripes({0, 0, 0});
  stripes.Row(1);
  EXPECT_EQ(stripes.frames.asked, (std::vector<std::size_t>{1}));
  stripes.settings.edges.feather = 2;
  stripes.Row(1);
  EXPECT_EQ(stripes.frames.asked, (std::vector<std::size_t>{1, 2, 0}));
  // Another framing knows no feather.
  stripes.settings.framing = Framing::stabilize_only;
  EXPECT_EQ(stripes.Row(1)[0].alpha, 1);
}

TEST(EdgeSynthesisOrder, FeatherAndBoostAreInTheAlphas) {
  Stripes stripes({0, 0});
  stripes.settings.edges.feather = 3;
  stripes.settings.synthesis_range = 0;
  // Columns have 1/8, 1/2, 7/8, 1; a pixel shows the middle between its column and the one before.
  const auto alone = stripes.Row(0);
  EXPECT_NEAR(alone[1].alpha, 5.0 / 16, 1e-6);
  EXPECT_NEAR(alone[2].alpha, 11.0 / 16, 1e-6);
  EXPECT_NEAR(alone[3].alpha, 15.0 / 16, 1e-6);
  EXPECT_EQ(alone[4].alpha, 1);

  // Another frame behind: a + b - a b.
  stripes.settings.synthesis_range = 1;
  EXPECT_NEAR(stripes.Row(0)[1].alpha, 2 * 5.0 / 16 - 25.0 / 256, 1e-6);
  stripes.settings.synthesis_range = 0;
  for (const double boost : {0.0, 1.0, 1.4}) {
    stripes.settings.alpha_boost = boost;
    EXPECT_NEAR(stripes.Row(0)[1].alpha, 5.0 / 16, 1e-6);
  }
  stripes.settings.alpha_boost = 1.5;  // 2
  EXPECT_NEAR(stripes.Row(0)[1].alpha, 10.0 / 16, 1e-6);
  EXPECT_EQ(stripes.Row(0)[2].alpha, 1);
  stripes.settings.alpha_boost = 3;
  EXPECT_NEAR(stripes.Row(0)[1].alpha, 15.0 / 16, 1e-6);
  EXPECT_NEAR(stripes.Row(0)[1].red, 0.1, 1e-6);
}

TEST(EdgeSynthesisOrder, AFrameThatCannotBeHadEndsTheRenderWithItsCode) {
  Stripes stripes({0, 30, -30});
  stripes.frames.refused = 2;
  EXPECT_THROW(stripes.Row(0), std::int32_t);
  stripes.settings.synthesis_range = 1;
  EXPECT_EQ(Stripes::Shown(stripes.Row(0)[80]), 1) << "not asked for what is out of range";
}

TEST(TileMaps, RectanglesCoverTheSetOnce) {
  std::mt19937 random(2);
  for (int run = 0; run < 50; ++run) {
    TileMap map(5 * TileMap::side + run % 30, 4 * TileMap::side - run % 7);
    std::vector<int> covered(map.width() * map.height());
    for (int i = 0; i < run % 9; ++i) {
      const int x = random() % map.width(), y = random() % map.height();
      map.add(x - 1, y, x + random() % 60, y + 1 + random() % 40);
    }
    map.add(-50, -50, 0, 0);
    map.add(10, 10, 10, 400);
    for (const pixel_rect& r : map.rects()) {
      for (int y = r.top; y < r.bottom; ++y) {
        for (int x = r.left; x < r.right; ++x) ++covered[y * map.width() + x];
      }
    }
    for (int y = 0; y < map.height(); ++y) {
      for (int x = 0; x < map.width(); ++x) {
        ASSERT_EQ(covered[y * map.width() + x], map.touches(x, y, x + 1, y + 1) ? 1 : 0);
      }
    }
    EXPECT_EQ(map.empty(), map.rects().empty());
  }
}

}  // namespace
}  // namespace marrow::render
