#include "stabilizer/render/deblur.h"

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <cmath>
#include <limits>
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

constexpr int kWidth = 41, kHeight = 31;

// Frames of one outline. Only the grid's centre moves, to the side.
class Clip final : public ClipWarps {
 public:
  explicit Clip(const std::vector<double>& centres) {
    for (const double x : centres) {
      records_.emplace_back(3, 3);
      for (int v = 0; v < 9; ++v) {
        records_.back().values[2 * v] = (v % 3) * (kWidth - 1) / 2.0 + (v == 4 ? x : 0);
        records_.back().values[2 * v + 1] = (v / 3) * (kHeight - 1) / 2.0;
      }
    }
  }
  std::size_t frameCount() const override { return records_.size(); }
  const VarVector& frameWarp(std::size_t f) const override { return records_.at(f); }
  bool warpedGridOfFrame(std::size_t M, std::size_t N, VarVector& warp) const override {
    if (M == N || unknown.count(M)) return false;
    warp = records_[N];
    return true;
  }
  frame_bounds unionBounds() const override { return {0, 0, kWidth - 1.0, kHeight - 1.0}; }
  std::int32_t frameWidth() const override { return kWidth; }
  std::int32_t frameHeight() const override { return kHeight; }
  std::int32_t gridCols() const override { return 3; }
  std::int32_t gridRows() const override { return 3; }

  std::set<std::size_t> unknown;  // frames without a motion to any other

 private:
  std::vector<VarVector> records_;
};

// Frames of the clip as they were set; counts what a render asks for.
template <class Pixel>
class Frames final : public SourceFrames<Pixel> {
 public:
  explicit Frames(std::size_t count) {
    for (std::size_t f = 0; f < count; ++f) {
      worlds_.push_back(boost::make_shared<WorldX<Pixel>>(kWidth, kHeight));
    }
  }
  void Fill(std::size_t frame, Pixel p) {
    for (int i = 0; i < kWidth * kHeight; ++i) worlds_[frame]->data()[i] = p;
  }
  WorldX<Pixel>& at(std::size_t frame) { return *worlds_[frame]; }
  boost::shared_ptr<const WorldX<Pixel>> Fetch(std::size_t frame) override {
    fetched.push_back(frame);
    return worlds_.at(frame);
  }
  std::vector<std::size_t> fetched;

 private:
  std::vector<boost::shared_ptr<WorldX<Pixel>>> worlds_;
};

template <class Pixel>
WorldX<Pixel> Render(const Clip& clip, Frames<Pixel>& frames, std::size_t frame,
                     const DeblurSettings& deblur) {
  RenderSettings settings;
  settings.framing = Framing::synthesize_edges;
  settings.deblur = deblur;
  Renderer renderer = makeRenderer(clip, 1, 1);
  PixelOperations<Pixel> operations;
  WorldX<Pixel> output(kWidth, kHeight);
  frames.fetched.clear();
  EXPECT_TRUE(renderFrame(clip, nullptr, settings, renderer, frame, frames, operations, output));
  return output;
}

template <class Pixel>
bool Same(const WorldX<Pixel>& a, const WorldX<Pixel>& b) {
  return std::memcmp(a.data(), b.data(), sizeof(Pixel) * kWidth * kHeight) == 0;
}

template <class Pixel>
Pixel Middle(const WorldX<Pixel>& world) {
  return world.row(kHeight / 2)[kWidth / 2];
}

DeblurSettings Settings(int range, double threshold = 0) {
  DeblurSettings settings;
  settings.range = range;
  settings.frame_threshold = threshold;
  settings.comparison_blur = 2;
  return settings;
}

// Frame f is of red f + 1, so that a picture tells which frame it is of.
class Choice : public ::testing::Test {
 protected:
  // Speeds: 0 8 4 7 3 0 2 2.
  const Clip clip{{0, 0, 8, 4, 1, 1, 1, 3}};
  Frames<HX_Pixel8> frames{8};
  Choice() {
    for (int f = 0; f < 8; ++f) frames.Fill(f, {255, static_cast<std::uint8_t>(f + 1), 0, 0});
  }
  int Shown(std::size_t frame, DeblurSettings settings, const Clip& of) {
    settings.debug = DeblurDebug::sharper_frame;
    return Middle(Render(of, frames, frame, settings)).red - 1;
  }
  int Shown(std::size_t frame, const DeblurSettings& settings) {
    return Shown(frame, settings, clip);
  }
};

TEST_F(Choice, TheSlowestOfTheParityWithinTheRange) {
  const struct {
    std::size_t frame;
    int range, chosen;
  } cases[] = {{3, 2, 5}, {3, 3, 5}, {1, 2, 3}, {1, 3, 3}, {1, 4, 5},
               {2, 2, 0}, {4, 2, 6}, {4, 3, 6}, {4, 4, 0}, {6, 99, 0}};
  for (const auto& c : cases) {
    EXPECT_EQ(Shown(c.frame, Settings(c.range)), c.chosen) << c.frame << " within " << c.range;
    EXPECT_EQ(frames.fetched.size(), 2u);
  }
  // Its own speed is the lowest: no debug view shows another, and nothing else is fetched.
  for (const std::size_t slowest : {0, 5}) {
    DeblurSettings settings = Settings(3, -1);
    settings.show_map = true;
    EXPECT_EQ(Middle(Render(clip, frames, slowest, settings)).red, slowest + 1);
    EXPECT_EQ(frames.fetched.size(), 1u);
    EXPECT_EQ(Shown(slowest, settings), static_cast<int>(slowest));
  }
}

TEST_F(Choice, OnlyFramesAboveTheThreshold) {
  EXPECT_EQ(Shown(3, Settings(2, 6.99)), 5);
  EXPECT_EQ(Shown(3, Settings(2, 7)), 3);
  EXPECT_EQ(frames.fetched.size(), 1u);
  // The first and the last frame stand in for the ones beyond: speeds 3 0 0 0 3.
  const Clip swing({0, 3, 0, 3, 0});
  EXPECT_EQ(Shown(0, Settings(2, 2.99), swing), 2);
  EXPECT_EQ(Shown(0, Settings(2, 3), swing), 0);
  EXPECT_EQ(Shown(4, Settings(2, 2.99), swing), 2);
}

TEST_F(Choice, TheAlignedViewShowsAnyFrame) {
  DeblurSettings settings = Settings(9, 100);
  settings.debug = DeblurDebug::aligned_frame;
  const auto shown = [&](std::size_t frame, double offset) {
    settings.aligned_frame = offset;
    const HX_Pixel8 p = Middle(Render(clip, frames, frame, settings));
    return p.alpha == 0 ? -1 : p.red - 1;
  };
  EXPECT_EQ(shown(5, -4), 1) << "faster";
  EXPECT_EQ(shown(5, 1.9), 6) << "odd, truncated";
  EXPECT_EQ(shown(5, -1.9), 4);
  EXPECT_EQ(shown(5, 0), 5);
  EXPECT_EQ(shown(5, 3), -1) << "behind the clip";
  EXPECT_EQ(shown(5, -50), -1);
  EXPECT_EQ(deblurReach(settings), 50);
  settings.debug = DeblurDebug::off;
  EXPECT_EQ(deblurReach(settings), 9);
  // Two frames have no third one of a parity.
  const Clip two({0, 5});
  settings.debug = DeblurDebug::aligned_frame;
  settings.aligned_frame = 1;
  EXPECT_EQ(Middle(Render(two, frames, 0, settings)).red, 1);
}

TEST_F(Choice, WithoutAKnownMotionThePictureStays) {
  Clip lost = clip;
  lost.unknown = {5};
  DeblurSettings settings = Settings(2);
  const WorldX<HX_Pixel8> untreated = Render(clip, frames, 3, {});
  EXPECT_TRUE(Same(Render(lost, frames, 3, settings), untreated));
  EXPECT_EQ(frames.fetched.size(), 1u);
  settings.show_map = true;
  const HX_Pixel8 map = Middle(Render(lost, frames, 3, settings));
  EXPECT_EQ(map.alpha, 255);
  EXPECT_EQ(map.red + map.green + map.blue, 0);
  for (const DeblurDebug view : {DeblurDebug::sharper_frame, DeblurDebug::blurred_sharper_frame}) {
    settings.debug = view;
    EXPECT_EQ(Middle(Render(lost, frames, 3, settings)).alpha, 0);
  }
}

// One even frame over another, of speeds 0 8 4 7 ...: 3 takes from 5.
template <class Pixel>
Pixel Mixed(Pixel out, Pixel sharper, const DeblurSettings& settings) {
  const Clip clip({0, 0, 8, 4, 1, 1, 1});
  Frames<Pixel> frames(7);
  frames.Fill(3, out);
  frames.Fill(5, sharper);
  return Middle(Render(clip, frames, 3, settings));
}

#define EXPECT_PIXEL(p, a, r, g, b) \
  do {                              \
    const auto found = p;           \
    EXPECT_EQ(found.alpha, a);      \
    EXPECT_EQ(found.red, r);        \
    EXPECT_EQ(found.green, g);      \
    EXPECT_EQ(found.blue, b);       \
  } while (false)

TEST(DeblurArithmetic, OfEachDepth) {
  DeblurSettings settings = Settings(2);
  // Thresholds 7.65 and 17.85; d = 15 weighs 0.2794, of 255: 71. Shifts round down.
  const HX_Pixel8 out8{255, 100, 50, 200};
  EXPECT_PIXEL(Mixed(out8, {200, 110, 50, 195}, settings), 239, 102, 50, 198);
  EXPECT_PIXEL(Mixed(out8, {200, 104, 50, 197}, settings), 200, 104, 50, 197);  // d = 7
  EXPECT_PIXEL(Mixed(out8, {255, 110, 58, 200}, settings), 255, 100, 50, 200);  // d = 18
  // Thresholds 983.04 and 2293.76; d = 1500 weighs 19844 of 32768.
  const HX_Pixel16 out16{32768, 12000, 0, 20000};
  EXPECT_PIXEL(Mixed(out16, {32768, 12900, 0, 19400}, settings), 32768, 12545, 0, 19636);
  EXPECT_PIXEL(Mixed(out16, {32768, 12500, 0, 19516}, settings), 32768, 12499, 0, 19516);
  EXPECT_PIXEL(Mixed(out16, {32768, 12983, 0, 20000}, settings), 32768, 12983, 0, 20000);
  const HX_PixelFloat half =
      Mixed<HX_PixelFloat>({1, 0.5f, 2, 0}, {0.5f, 0.53f, 1.98f, 0}, settings);
  EXPECT_NEAR(half.alpha, 0.75, 1e-4);
  EXPECT_NEAR(half.red, 0.515, 1e-5);
  EXPECT_NEAR(half.green, 1.99, 1e-5);

  settings.show_map = true;
  EXPECT_PIXEL(Mixed(out8, {200, 110, 50, 195}, settings), 255, 71, 71, 71);
  EXPECT_PIXEL(Mixed(out8, {200, 104, 50, 197}, settings), 255, 255, 255, 255);
  EXPECT_PIXEL(Mixed(out16, {32768, 12900, 0, 19400}, settings), 32768, 19844, 19844, 19844);
  EXPECT_PIXEL(Mixed(out16, {32768, 15000, 0, 19400}, settings), 32768, 0, 0, 0);
}

TEST(DeblurArithmetic, EqualThresholdsCutSharply) {
  DeblurSettings settings = Settings(2);
  settings.pixel_threshold = settings.pixel_limit = 0.25f;  // of 32768: 8192
  const HX_Pixel16 out{32768, 1000, 0, 0};
  EXPECT_EQ(Mixed(out, {32768, 9192, 0, 0}, settings).red, 9192);
  EXPECT_EQ(Mixed(out, {32768, 9193, 0, 0}, settings).red, 1000);
}

TEST(DeblurArithmetic, NothingIsTakenFromWhatIsTransparentOrNoNumber) {
  DeblurSettings settings = Settings(2);
  EXPECT_PIXEL(Mixed<HX_Pixel8>({255, 3, 0, 0}, {0, 3, 0, 0}, settings), 255, 3, 0, 0);
  const float nan = std::numeric_limits<float>::quiet_NaN();
  const float infinite = std::numeric_limits<float>::infinity();
  const HX_PixelFloat out{1, 0.5f, 0.5f, 0.5f};
  for (const float bad : {nan, infinite, -infinite}) {
    for (const HX_PixelFloat sharper :
         {HX_PixelFloat{1, bad, 0.5f, 0.5f}, HX_PixelFloat{1, 0.5f, 0.5f, bad}}) {
      settings.show_map = false;
      EXPECT_PIXEL(Mixed(out, sharper, settings), 1, 0.5f, 0.5f, 0.5f);
      EXPECT_TRUE(std::isnan(Mixed(HX_PixelFloat{1, nan, 0, 0}, out, settings).red));
      settings.show_map = true;
      EXPECT_PIXEL(Mixed(out, sharper, settings), 1, 0, 0, 0);
    }
  }
}

// Whole pictures of texture, against the same steps one by one.
template <class Pixel>
class DeblurPicture : public ::testing::Test {
 protected:
  using Channel = decltype(Pixel::red);
  static constexpr double kFull = sizeof(Channel) == 4 ? 1 : sizeof(Channel) == 2 ? 32768 : 255;

  DeblurPicture() {
    // Two pictures of one ramp; to the left they are alike but for noise, to the right they part.
    std::mt19937 random(5);
    std::uniform_real_distribution<double> noise(0, 0.3);
    for (const std::size_t f : {3, 5}) {
      for (int y = 0; y < kHeight; ++y) {
        for (int x = 0; x < kWidth; ++x) {
          const auto value = [&] {
            return static_cast<Channel>(
                kFull * (0.1 + 0.01 * y + noise(random) + (f == 5 ? 0.2 * x / kWidth : 0)));
          };
          const double alpha = f == 5 && y < 6 ? 0 : 0.7 + noise(random);
          frames.at(f).row(y)[x] = {static_cast<Channel>(kFull * alpha), value(), value(), value()};
        }
      }
    }
  }
  static double Weight(const Pixel& b, const Pixel& c, double t1, double t2) {
    const double d = std::abs(double(b.red) - c.red) + std::abs(double(b.green) - c.green) +
                     std::abs(double(b.blue) - c.blue);
    t1 *= kFull;
    t2 *= kFull;
    return d <= t1 ? 1 : d >= t2 ? 0 : (t2 - d) / (t2 - t1);
  }
  static double Blend(double out, double sharper, double w) {
    if (kFull == 1) return out + (sharper - out) * w;
    const double weight = std::floor(w * kFull + 0.5);
    return out + std::floor((sharper - out) * weight / (kFull == 255 ? 256 : 32768));
  }

  const Clip clip{{0, 0, 8, 4, 1, 1, 1}};
  Frames<Pixel> frames{7};
};
using Depths = ::testing::Types<HX_Pixel8, HX_Pixel16, HX_PixelFloat>;
TYPED_TEST_SUITE(DeblurPicture, Depths);

TYPED_TEST(DeblurPicture, IsWhatTheStepsGiveOneByOne) {
  using Pixel = TypeParam;
  DeblurSettings settings = Settings(2);
  settings.pixel_threshold = 0.14f;
  settings.pixel_limit = 0.45f;
  const auto render = [&](DeblurDebug view, bool map) {
    settings.debug = view;
    settings.show_map = map;
    return Render(this->clip, this->frames, 3, settings);
  };
  const WorldX<Pixel> out = Render(this->clip, this->frames, 3, {});
  const WorldX<Pixel> sharper = render(DeblurDebug::sharper_frame, false);
  PixelOperations<Pixel> operations;
  WorldX<Pixel> b(kWidth, kHeight), c(kWidth, kHeight);
  operations.Blur(sharper, b, 2);
  operations.Blur(out, c, 2);
  EXPECT_TRUE(Same(render(DeblurDebug::this_frame, true), out)) << "a view comes before the map";
  EXPECT_TRUE(Same(render(DeblurDebug::blurred_sharper_frame, false), b));
  EXPECT_TRUE(Same(render(DeblurDebug::blurred_this_frame, true), c));

  const WorldX<Pixel> mixed = render(DeblurDebug::off, false);
  const WorldX<Pixel> map = render(DeblurDebug::off, true);
  const double full = this->kFull, tolerance = full == 1 ? 1e-5 : 0;
  int none = 0, all = 0;
  for (int y = 0; y < kHeight; ++y) {
    for (int x = 0; x < kWidth; ++x) {
      const Pixel &o = out.row(y)[x], &s = sharper.row(y)[x], &m = mixed.row(y)[x];
      const double w = s.alpha > 0 ? this->Weight(b.row(y)[x], c.row(y)[x], 0.14f, 0.45f) : 0;
      none += w == 0;
      all += w == 1;
      const auto blend = [&](double p, double q) { return w == 1 ? q : this->Blend(p, q, w); };
      ASSERT_NEAR(m.alpha, blend(o.alpha, s.alpha), tolerance) << x << ", " << y << ": " << w;
      ASSERT_NEAR(m.red, blend(o.red, s.red), tolerance) << x << ", " << y << ": " << w;
      ASSERT_NEAR(m.green, blend(o.green, s.green), tolerance);
      ASSERT_NEAR(m.blue, blend(o.blue, s.blue), tolerance);
      ASSERT_NEAR(map.row(y)[x].green, full == 1 ? w : std::floor(w * full + 0.5), tolerance);
      ASSERT_EQ(map.row(y)[x].alpha, full);
    }
  }
  EXPECT_GT(none, 50);
  EXPECT_GT(all, 50);
  EXPECT_LT(none + all, kWidth * kHeight - 200);
}

}  // namespace
}  // namespace marrow::render
