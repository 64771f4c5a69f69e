#include "analysis/effect/banner.h"

#include <gmock/gmock.h>

#include "tests/analysis/effect/test_effect.h"
#include "tests/effect/fake_pixels.h"

namespace kelp::analysis::effect {
namespace {

using tesselui::drawbot::Color;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

std::vector<int> Numbers(const BannerLayout& l) {
  return {l.text_width, l.text_height, l.band_width, l.band_height, l.band_top, l.text_x, l.text_y};
}

TEST(BannerLayoutTest, TheTextStandsInTheMiddleOfABandAboveTheFramesMiddle) {
  EXPECT_THAT(Numbers(LayOutBanner(300, 24, 1920, 1080, 1)),
              ElementsAre(300, 24, 1920, 48, 492, 810, 504));
  EXPECT_THAT(Numbers(LayOutBanner(300, 24, 1920, 1080, 0.5)),
              ElementsAre(150, 12, 960, 24, 246, 405, 252));
  // Room for 380 pixels in 320: the scale is 16/19, also at half resolution.
  EXPECT_THAT(Numbers(LayOutBanner(300, 25, 320, 241, 1)),
              ElementsAre(253, 22, 320, 44, 77, 33, 88));
  EXPECT_THAT(Numbers(LayOutBanner(300, 25, 320, 241, 0.5)),
              ElementsAre(253, 22, 160, 44, 17, -46, 28));
  // A text that is too wide for 1200 pixels is cut by the frame.
  EXPECT_THAT(Numbers(LayOutBanner(2000, 20, 1280, 720, 1)),
              ElementsAre(2000, 20, 1280, 40, 316, -360, 326));
  EXPECT_THAT(Numbers(LayOutBanner(300, 24, 4, 4, 1)), ElementsAre(4, 1, 4, 2, 0, 0, 0));
}

class BannerTest : public EffectTest {
 protected:
  struct Buffer {
    std::vector<std::uint64_t> data;
    HX_World world{};
  };
  // All pixels half grey.
  static Buffer MakeBuffer(int width, int height, std::uint32_t format, const FakePixel& pixel) {
    Buffer buffer;
    const int row_bytes = width * FakePixelBytes(format);
    buffer.data.resize((std::size_t(row_bytes) * height + 7) / 8);
    buffer.world = {buffer.data.data(),   row_bytes, width, height, 0, 0, 0, format,
                    {0, 0, width, height}};
    for (int y = 0; y < height; ++y) {
      for (int x = 0; x < width; ++x) StoreFakePixel(buffer.world, x, y, pixel);
    }
    return buffer;
  }
  static std::vector<int> Bytes(const HX_World& world, int x, int y) {
    const auto* c = FakeChannels<std::uint8_t>(world, x, y);
    return {c[0], c[1], c[2], c[3]};
  }
  // Blue, green, red, alpha, each as a drawing library may round it.
  static auto Near(int b, int g, int r, int a) {
    const auto near = [](int c) {
      return ::testing::AllOf(::testing::Ge(c - 1), ::testing::Le(c + 1));
    };
    return ElementsAre(near(b), near(g), near(r), a);
  }
  void Draw(const StatusRecord& record, HX_World& output) {
    TestEffect effect(Context());
    DrawBanner(effect, record, output);
  }
};

TEST_F(BannerTest, WorkInProgressIsStripedAndTheRestIsFlat) {
  TestEffect effect(Context());
  Color first, second;
  Buffer band = MakeBuffer(100, 48, HX_FORMAT_BGRA8, {});
  effect.GetBannerColors(FrameStatus::AnalysisInProgress, &first, &second);
  PaintBand(band.world, first, second);
  const auto blue = Near(255, 64, 2, 204), dark = Near(204, 51, 2, 204);
  // Stripes of 24 * 1.414 = 33.936 pixels, 32.936 apart from -1628.928 on, and 67.872 to the right
  // from bottom to top: at x the bottom row is in stripe (x - 0.2 + 1628.9) / 32.936.
  EXPECT_THAT(Bytes(band.world, 0, 47), dark);   // 49.45
  EXPECT_THAT(Bytes(band.world, 30, 47), blue);  // 50.36
  EXPECT_THAT(Bytes(band.world, 60, 47), dark);  // 51.27
  EXPECT_THAT(Bytes(band.world, 0, 0), dark);    // 47.43, 66.7 further left
  EXPECT_THAT(Bytes(band.world, 30, 0), blue);   // 48.34
  EXPECT_THAT(Bytes(band.world, 99, 0), blue);   // 50.44
  for (int y = 0; y < 48; ++y) {
    for (int x = 0; x < 100; ++x) {  // no gap between stripes
      const std::vector<int> p = Bytes(band.world, x, y);
      EXPECT_EQ(p[3], 204);
      EXPECT_GE(p[0], 203) << x << " " << y;
      EXPECT_NEAR(p[1], p[0] / 4, 2);
    }
  }

  effect.GetBannerColors(FrameStatus::SubsequentSolveOnDeletion, &first, &second);
  EXPECT_FLOAT_EQ(second.green, 0.266664f);
  band = MakeBuffer(100, 48, HX_FORMAT_BGRA8, {});
  PaintBand(band.world, first, second);
  EXPECT_THAT(Bytes(band.world, 30, 47), Near(0, 85, 204, 51));
  EXPECT_THAT(Bytes(band.world, 60, 47), Near(0, 68, 163, 51));

  for (const auto status :
       {FrameStatus::TrackingFailed, FrameStatus::SolveFailed, FrameStatus::GeneralFailure}) {
    effect.GetBannerColors(status, &first, &second);
    band = MakeBuffer(3, 2, HX_FORMAT_BGRA8, {});
    PaintBand(band.world, first, second);
    EXPECT_THAT(Bytes(band.world, 2, 1), Near(0, 0, 197, 204));
  }
  effect.GetBannerColors(FrameStatus::OutsideRange, &first, &second);
  band = MakeBuffer(3, 2, HX_FORMAT_BGRA8, {});
  PaintBand(band.world, first, second);
  EXPECT_THAT(Bytes(band.world, 0, 0), blue);
}

TEST_F(BannerTest, AllDepthsAndScalesShowTheSameBanner) {
  host_.in.width = 640;
  host_.in.height = 360;
  for (const std::uint32_t half : {1u, 2u}) {
    host_.in.downsample_x = host_.in.downsample_y = {1, half};
    const int width = 640 / half, height = 360 / half;
    for (const std::uint32_t format : {HX_FORMAT_ARGB8, HX_FORMAT_ARGB16, HX_FORMAT_ARGBF}) {
      Buffer output = MakeBuffer(width, height, format, {1, 0.5, 0.5, 0.5});
      output.world.origin_x = 4;  // the buffer is a part of the frame
      output.world.origin_y = 10;
      Draw({FrameStatus::TrackingFailed, ""}, output.world);
      const BannerImage image("Analysis failed.", {});
      const BannerLayout layout = LayOutBanner(image.width(), image.height(), 640, 360, 1.0 / half);
      const int top = layout.band_top - 10, bottom = top + layout.band_height;
      EXPECT_NEAR(LoadFakePixel(output.world, 1, top - 1).r, 0.5, 0.003);
      EXPECT_NEAR(LoadFakePixel(output.world, 1, bottom).r, 0.5, 0.003);
      for (const int y : {top, bottom - 1}) {
        const FakePixel p = LoadFakePixel(output.world, 1, y);
        EXPECT_NEAR(p.r, 0.718, 0.004);  // 0.8 * 0.77255 + 0.2 * 0.5
        EXPECT_NEAR(p.g, 0.1, 0.004);
        EXPECT_NEAR(p.a, 1, 0.001);
      }
      // The text is white, and nowhere but in its place.
      double brightest = 0;
      for (int y = top; y < bottom; ++y) {
        for (int x = 0; x < width; ++x) {
          const double g = LoadFakePixel(output.world, x, y).g;
          const int u = x + 4 - layout.text_x, v = y + 10 - layout.text_y;
          if (u >= 0 && v >= 0 && u < layout.text_width && v < layout.text_height) {
            brightest = std::max(brightest, g);
          } else if (x + 4 < layout.band_width) {
            EXPECT_LT(g, 0.11) << x << " " << y;
          }
        }
      }
      EXPECT_GT(brightest, half == 1 ? 0.9 : 0.5);
    }
  }
}

TEST_F(BannerTest, AnImageIsMadeOncePerStatusAndFailureText) {
  Buffer output = MakeBuffer(kWidth, kHeight, HX_FORMAT_ARGB8, {});
  for (int i = 0; i < 2; ++i) {
    Draw({FrameStatus::PressAnalyze, ""}, output.world);
    Draw({FrameStatus::AnalysisInProgress, ""}, output.world);
    Draw({FrameStatus::AnalysisInProgress, "not a failure's text"}, output.world);
  }
  EXPECT_EQ(TestEffect::log.banners->size(), 2u);
  for (const char* text : {"", "Lost.", "$$$/Key=Lost.", "Still lost."}) {
    Draw({FrameStatus::GeneralFailure, text}, output.world);
  }
  EXPECT_EQ(TestEffect::log.banners->size(), 6u);
  const StatusRecord keyed{FrameStatus::GeneralFailure, "$$$/Key=Lost."};
  EXPECT_EQ(TestEffect::log.banners->Get(keyed, "")->width(), BannerImage("Lost.", {}).width());

  host_.ForgetOperations();
  for (const auto status : {FrameStatus::None, FrameStatus::Ready})
    Draw({status, ""}, output.world);
  EXPECT_THAT(host_.operations(), IsEmpty());
  for (int n = 1; n <= 5; ++n) {  // suite, world, band, copy of the text, text: each may fail
    host_.ForgetOperations();
    host_.FailOperation(n);
    EXPECT_THROW(Draw({FrameStatus::PressAnalyze, ""}, output.world), std::int32_t) << n;
  }
}

TEST_F(BannerTest, RendersOfSeveralThreadsShareTheImages) {
  const kelp::effect::HostContext context = Context();
  std::vector<std::thread> renders;
  for (int r = 0; r < 4; ++r) {
    renders.emplace_back([&context] {
      Buffer output = MakeBuffer(kWidth, kHeight, HX_FORMAT_ARGB8, {1, 0, 0, 0});
      for (const auto status : {FrameStatus::PressAnalyze, FrameStatus::OutsideRange,
                                FrameStatus::AnalysisInProgress}) {
        TestEffect effect(context);
        DrawBanner(effect, {status, ""}, output.world);
      }
    });
  }
  for (std::thread& render : renders) render.join();
  EXPECT_EQ(TestEffect::log.banners->size(), 3u);
}

}  // namespace
}  // namespace kelp::analysis::effect
