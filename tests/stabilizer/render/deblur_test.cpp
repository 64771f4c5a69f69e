#include "stabilizer/render/deblur.h"

#include <cmath>
#include <numeric>

#include "synthetic/scene.h"
#include "tests/stabilizer/render/solved_clip.h"

namespace marrow::render {
namespace {

constexpr int kWidth = 41, kHeight = 77;

// Frames of one outline. Only the grid's middle moves, to the side.
SolvedClip ClipOf(const std::vector<double>& places) {
  SolvedClip clip(kWidth, kHeight, 3, 3);
  for (std::size_t f = 0; f < places.size(); ++f) {
    clip.Add(Moved(0, 0));
    clip.Set(f, 1, 1, {kWidth / 2 + places[f], kHeight / 2.0});
  }
  return clip;
}

template <class Pixel>
Pixel Middle(const WorldX<Pixel>& world) {
  return world.row(kHeight / 2)[kWidth / 2];
}

DeblurSettings Within(int range, double threshold = 0) {
  DeblurSettings settings;
  settings.range = range;
  settings.frame_threshold = threshold;
  settings.comparison_blur = 2;
  return settings;
}

template <class Pixel>
WorldX<Pixel> Deblurred(const SolvedClip& clip, Pictures<Pixel>& pictures, std::size_t frame,
                        const DeblurSettings& deblur) {
  pictures.asked.clear();
  return Rendered(clip, pictures, {.framing = Framing::synthesize_edges, .deblur = deblur}, frame);
}

// Frame f is of red f + 1, so that a picture tells which frame it is of.
class DeblurChoice : public testing::Test {
 protected:
  const SolvedClip clip = ClipOf({0, 0, 8, 4, 1, 1, 1, 3});  // speeds 0 8 4 7 3 0 2 2
  Pictures<HX_Pixel8> pictures;
  DeblurChoice() {
    for (std::uint8_t f = 1; f <= 8; ++f) pictures.Add(kWidth, kHeight, {255, f, 0, 0});
  }
  // -1: nothing.
  int Shown(const SolvedClip& of, std::size_t frame, const DeblurSettings& settings) {
    const HX_Pixel8 p = Middle(Deblurred(of, pictures, frame, settings));
    return p.alpha == 0 ? -1 : p.red - 1;
  }
  int Chosen(const SolvedClip& of, std::size_t frame, DeblurSettings settings) {
    settings.debug = DeblurDebug::sharper_frame;
    return Shown(of, frame, settings);
  }
};

TEST_F(DeblurChoice, TheSlowestOfTheParityWithinTheRangeForFramesAboveTheThreshold) {
  // The first and the last frame stand in for the ones beyond: speeds 3 0 0 0 3.
  const SolvedClip swing = ClipOf({0, 3, 0, 3, 0});
  const struct {
    const SolvedClip& of;
    int frame, range, chosen;
    double threshold = 0;
  } cases[] = {{clip, 3, 2, 5},       {clip, 3, 3, 5},       {clip, 1, 2, 3},
               {clip, 1, 3, 3},       {clip, 1, 4, 5},       {clip, 2, 2, 0},
               {clip, 4, 2, 6},       {clip, 4, 3, 6},       {clip, 4, 4, 0},
               {clip, 6, 99, 0},      {clip, 0, 3, 0, -1},   {clip, 5, 3, 5, -1},
               {clip, 3, 2, 5, 6.99}, {clip, 3, 2, 3, 7},    {swing, 0, 2, 2, 2.99},
               {swing, 0, 2, 0, 3},   {swing, 4, 2, 2, 2.99}};
  for (const auto& c : cases) {
    SCOPED_TRACE(&c - cases);
    DeblurSettings settings = Within(c.range, c.threshold);
    EXPECT_EQ(Chosen(c.of, c.frame, settings), c.chosen);
    EXPECT_EQ(pictures.asked.size(), c.chosen == c.frame ? 1u : 2u);
    settings.show_map = true;
    EXPECT_EQ(Shown(c.of, c.frame, settings) == c.frame, c.chosen == c.frame) << "no map either";
  }
}

TEST_F(DeblurChoice, TheAlignedViewShowsAnyFrame) {
  DeblurSettings settings = Within(9, 100);
  settings.debug = DeblurDebug::aligned_frame;
  const struct {
    double offset;
    int shown;
  } cases[] = {{-4, 1}, {1.9, 6}, {-1.9, 4}, {0, 5}, {3, -1}, {-50, -1}};
  for (const auto& c : cases) {
    settings.aligned_frame = c.offset;
    EXPECT_EQ(Shown(clip, 5, settings), c.shown) << c.offset;
  }
  // Two frames have no third one of a parity.
  settings.aligned_frame = 1;
  EXPECT_EQ(Shown(ClipOf({0, 5}), 0, settings), 0);
}

TEST_F(DeblurChoice, WithoutAKnownMotionThePictureStays) {
  SolvedClip lost = clip;
  lost.without_motion = {5};
  DeblurSettings settings = Within(2);
  const auto untreated = Deblurred(clip, pictures, 3, {});
  EXPECT_TRUE(Same(Deblurred(lost, pictures, 3, settings), untreated));
  EXPECT_EQ(pictures.asked.size(), 1u);
  settings.show_map = true;
  const HX_Pixel8 map = Middle(Deblurred(lost, pictures, 3, settings));
  EXPECT_EQ(map.alpha, 255);
  EXPECT_EQ(map.red + map.green + map.blue, 0);
  for (const DeblurDebug view : {DeblurDebug::sharper_frame, DeblurDebug::blurred_sharper_frame}) {
    settings.debug = view;
    EXPECT_EQ(Shown(lost, 3, settings), -1);
  }
}

// Of speeds 0 8 4 7 3 0 0: 3 takes from 5.
template <class Pixel>
class Deblur : public testing::Test {
 protected:
  Deblur() {
    for (int f = 0; f < 7; ++f) pictures.Add(kWidth, kHeight, {});
  }
  WorldX<Pixel> Treated() { return Deblurred(clip, pictures, 3, settings); }
  // Of two frames of one colour each.
  Pixel Mixed(const Pixel& out, const Pixel& sharper) {
    std::fill_n(pictures.worlds[3]->data(), kWidth * kHeight, out);
    std::fill_n(pictures.worlds[5]->data(), kWidth * kHeight, sharper);
    return Middle(Treated());
  }
  void ExpectMix(const Pixel& out, const Pixel& sharper, const Channels& mixed, double map) {
    settings.show_map = false;
    EXPECT_EQ(Of(Mixed(out, sharper)), mixed);
    settings.show_map = true;
    EXPECT_EQ(Of(Mixed(out, sharper)), (Channels{full<Pixel>, map, map, map}));
  }

  const SolvedClip clip = ClipOf({0, 0, 8, 4, 1, 1, 1});
  Pictures<Pixel> pictures;
  DeblurSettings settings = Within(2);
};
TYPED_TEST_SUITE(Deblur, Depths);

using Deblur8 = Deblur<HX_Pixel8>;
using Deblur16 = Deblur<HX_Pixel16>;
using DeblurFloat = Deblur<HX_PixelFloat>;

TEST_F(Deblur8, MixesByAWeightOf255AndRoundsDown) {
  const HX_Pixel8 out{255, 100, 50, 200};                        // thresholds 7.65 and 17.85
  ExpectMix(out, {200, 110, 50, 195}, {239, 102, 50, 198}, 71);  // differ by 15: 0.2794
  ExpectMix(out, {200, 104, 50, 197}, {200, 104, 50, 197}, 255);
  ExpectMix(out, {255, 110, 58, 200}, {255, 100, 50, 200}, 0);
}

TEST_F(Deblur16, MixesByAWeightOf32768AndRoundsDown) {
  const HX_Pixel16 out{32768, 12000, 0, 20000};  // thresholds 983.04 and 2293.76
  ExpectMix(out, {16384, 12900, 0, 19400}, {22846, 12545, 0, 19636}, 19844);  // by 1500: 0.6056
  ExpectMix(out, {32768, 12500, 0, 19516}, {32768, 12499, 0, 19516}, 32744);
  ExpectMix(out, {32768, 12983, 0, 20000}, {32768, 12983, 0, 20000}, 32768);
  ExpectMix(out, {32768, 15000, 0, 19400}, {32768, 12000, 0, 20000}, 0);
  settings.pixel_threshold = settings.pixel_limit = 0.25f;  // of 32768: 8192
  ExpectMix(out, {32768, 20192, 0, 20000}, {32768, 20192, 0, 20000}, 32768);
  ExpectMix(out, {32768, 20193, 0, 20000}, {32768, 12000, 0, 20000}, 0);
}

TEST_F(DeblurFloat, MixesByTheWeightAndTakesNoNumbersThatAreNone) {
  const HX_PixelFloat out{1, 0.5f, 2, 0};
  const auto half = Of(Mixed(out, {0.5f, 0.53f, 1.98f, 0}));
  const Channels expected{0.75, 0.515, 1.99, 0};
  for (int i = 0; i < 4; ++i) EXPECT_NEAR(half[i], expected[i], 1e-4) << i;
  const float nan = std::numeric_limits<float>::quiet_NaN();
  for (const float bad : {nan, std::numeric_limits<float>::infinity(), -INFINITY}) {
    ExpectMix(out, {1, bad, 2, 0}, Of(out), 0);
    ExpectMix(out, {1, 0.5f, 2, bad}, Of(out), 0);
  }
  settings.show_map = false;
  EXPECT_TRUE(std::isnan(Mixed({1, nan, 0, 0}, out).red));
}

// A transparent pixel shows as black, from which this one hardly differs.
TYPED_TEST(Deblur, NothingIsTakenFromWhatIsTransparent) {
  const TypeParam out = PixelOf<TypeParam>(1, 1.0 / 64, 0, 0);
  this->ExpectMix(out, PixelOf<TypeParam>(0, 0, 0, 0), Of(out), 0);
}

// Squares of four pixels, light and dark, the other way round in the sharper frame: blurred, the
// two are one grey.
TYPED_TEST(Deblur, PixelsAreComparedBlurredAndTakenSharp) {
  for (int y = 0; y < kHeight; ++y) {
    for (int x = 0; x < kWidth; ++x) {
      const double light = (x / 4 + y / 4) % 2 ? 0.4 : 0.6;
      this->pictures.worlds[3]->row(y)[x] = PixelOf<TypeParam>(1, light, light, light);
      this->pictures.worlds[5]->row(y)[x] = PixelOf<TypeParam>(1, 1 - light, 1 - light, 1 - light);
    }
  }
  const auto view = [&](DeblurDebug debug) {
    this->settings.debug = debug;
    return this->Treated();
  };
  const auto own = Deblurred(this->clip, this->pictures, 3, {});
  const auto sharper = view(DeblurDebug::sharper_frame);
  EXPECT_TRUE(Same(view(DeblurDebug::this_frame), own));
  this->settings.comparison_blur = 8;
  const auto blurred_mix = view(DeblurDebug::off);
  this->settings.comparison_blur = 0;
  const auto sharp_mix = view(DeblurDebug::off);
  int differ = 0;
  for (int y = 14; y < kHeight - 14; ++y) {
    for (int x = 14; x < kWidth - 14; ++x) {
      const auto &o = own.row(y)[x], &s = sharper.row(y)[x];
      ASSERT_EQ(Of(blurred_mix.row(y)[x]), Of(s)) << x << ", " << y;
      if (std::abs(double(o.red) - s.red) < 0.1 * full<TypeParam>) continue;
      ASSERT_EQ(Of(sharp_mix.row(y)[x]), Of(o)) << x << ", " << y;
      ++differ;
    }
  }
  EXPECT_GT(differ, 100);

  this->settings.comparison_blur = 3;
  PixelOperations<TypeParam> operations;
  WorldX<TypeParam> blurred(own.width(), own.height());
  operations.Blur(own, blurred, 3);
  EXPECT_TRUE(Same(view(DeblurDebug::blurred_this_frame), blurred));
  operations.Blur(sharper, blurred, 3);
  EXPECT_TRUE(Same(view(DeblurDebug::blurred_sharper_frame), blurred));
  this->settings.show_map = true;
  EXPECT_TRUE(Same(view(DeblurDebug::this_frame), own)) << "a view comes before the map";
}

// Between frames 2 and 4 the camera is knocked aside by 14 pixels, and rests before and after.
TEST(DeblurredScene, AKnockedFrameComesCloserToTheSharpTruth) {
  const auto knocked = [](double t) { return 0.8 * std::clamp((t - 2) / 2, 0.0, 1.0); };
  const auto pose = [&](double t) { return synthetic::camera_pose{{}, {knocked(t), 0, 0}}; };
  const synthetic::camera_path path{pose, pose};
  synthetic::scene_options options{.width = 160, .height = 90};
  const synthetic::scene sharp(synthetic::wall(8), path, options);
  options.exposure = [](int frame) { return frame == 3 ? 0.8 : 0.0; };
  const synthetic::scene shot(synthetic::wall(8), path, options);
  SolvedClip clip(160, 90, 3, 3);
  Pictures<HX_Pixel8> pictures;
  for (int f = 0; f < 7; ++f) {
    clip.Add(Moved(sharp.camera().focal * knocked(f) / 8, 0));
    pictures.Add(160, 90, {});
    sharp.render(f, pictures.worlds[f]->data(), 160);
  }
  const auto truth = Deblurred(clip, pictures, 3, {});
  shot.render(3, pictures.worlds[3]->data(), 160);
  const auto error = [&](int range) {
    const auto found = Deblurred(clip, pictures, 3, {.range = range});
    const auto of = [](const auto& world) {
      return reinterpret_cast<const std::uint8_t*>(world.data());
    };
    const auto end = of(found) + 4 * found.width() * found.height();
    return std::inner_product(of(found), end, of(truth), 0.0, std::plus(),
                              [](double a, double b) { return (a - b) * (a - b); });
  };
  EXPECT_GT(10 * std::log10(error(0) / error(3)), 6) << "dB";
}

}  // namespace
}  // namespace marrow::render
