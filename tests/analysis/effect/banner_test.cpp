#include "analysis/effect/banner.h"

#include <gmock/gmock.h>

#include <array>

#include "analysis/effect/banner_cache.h"
#include "stabilizer/effect/src/stabilizer_effect.h"
#include "tests/support/hosted_effect.h"

namespace kelp::analysis::effect {
namespace {

using calmframe::host::ChannelAt;
using calmframe::host::HostedEffect;
using calmframe::host::Operations;
using calmframe::host::WorldBuffer;
using kelp::effect::StabilizerEffect;
using tesselui::drawbot::Color;
using ::testing::ElementsAre;

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

class BannerTest : public ::testing::Test {
 protected:
  BannerTest() { hosted_.Apply(); }

  // Blue, green, red, as a drawing library may round them, and alpha.
  static void ExpectPixel(const WorldBuffer& band, int x, int y, const std::array<int, 4>& bgra) {
    const auto* c = band.row<std::uint8_t>(y) + 4 * x;
    for (int i = 0; i < 4; ++i) EXPECT_NEAR(c[i], bgra[i], i < 3) << x << " " << y;
  }
  std::unique_ptr<WorldBuffer> Band(FrameStatus status) {
    Color first, second;
    hosted_.Inside(
        [&](StabilizerEffect& effect) { effect.GetBannerColors(status, &first, &second); });
    auto band = std::make_unique<WorldBuffer>(100, 48, HX_FORMAT_BGRA8);
    PaintBand(band->world(), first, second);
    return band;
  }

  HostedEffect hosted_{calmframe::host::SmallClip()};
};

// Which status has which colour, and what is flat, is asked of the plug-in in tests/contract.
TEST_F(BannerTest, WorkInProgressIsStriped) {
  const std::array<int, 4> blue = {255, 64, 2, 204}, dark = {204, 51, 2, 204};
  auto band = Band(FrameStatus::AnalysisInProgress);
  // Stripes of 24 * 1.414 = 33.936 pixels, 32.936 apart from -1628.928 on, and 67.872 to the
  // right from bottom to top: at x the bottom row is in stripe (x - 0.2 + 1628.9) / 32.936.
  ExpectPixel(*band, 0, 47, dark);   // 49.45
  ExpectPixel(*band, 30, 47, blue);  // 50.36
  ExpectPixel(*band, 60, 47, dark);  // 51.27
  ExpectPixel(*band, 0, 0, dark);    // 47.43, 66.7 further left
  ExpectPixel(*band, 30, 0, blue);   // 48.34
  ExpectPixel(*band, 99, 0, blue);   // 50.44
  for (int y = 0; y < 48; ++y) {
    for (int x = 0; x < 100; ++x) {  // no gap between stripes
      const auto* p = band->row<std::uint8_t>(y) + 4 * x;
      EXPECT_EQ(p[3], 204);
      EXPECT_GE(p[0], 203) << x << " " << y;
      EXPECT_NEAR(p[1], p[0] / 4, 2);
    }
  }
  band = Band(FrameStatus::SubsequentSolveOnDeletion);
  ExpectPixel(*band, 30, 47, {0, 85, 204, 51});
  ExpectPixel(*band, 60, 47, {0, 68, 163, 51});
}

// Depths, scales and paths are asked of the plug-in in tests/contract.
TEST_F(BannerTest, TheTextIsWhiteAndNowhereButInItsPlace) {
  hosted_.Inside([](StabilizerEffect& effect) {
    effect.context().in->width = 640;
    effect.context().in->height = 360;
    WorldBuffer output(640, 360, HX_FORMAT_ARGBF);
    output.world().origin_x = 4;  // the buffer is a part of the frame
    output.world().origin_y = 10;
    DrawBanner(effect, {FrameStatus::TrackingFailed, ""}, output.world());
    const BannerImage image("Analysis failed.", {});
    const BannerLayout layout = LayOutBanner(image.width(), image.height(), 640, 360, 1);
    const int top = layout.band_top, bottom = top + layout.band_height;
    EXPECT_EQ(ChannelAt(output, 5, top - 1, 0), 0);
    EXPECT_EQ(ChannelAt(output, 5, bottom, 0), 0);
    double brightest = 0;
    for (int y = top; y < bottom; ++y) {
      for (int x = 4; x < layout.band_width; ++x) {
        const double green = ChannelAt(output, x, y, 2);
        const int u = x - layout.text_x, v = y - layout.text_y;
        if (u >= 0 && v >= 0 && u < layout.text_width && v < layout.text_height) {
          brightest = std::max(brightest, green);
        } else {
          EXPECT_NEAR(green, 0, 0.004) << x << " " << y;
        }
      }
    }
    EXPECT_GT(brightest, 0.9);
  });
}

TEST_F(BannerTest, AnImageIsMadeOncePerStatusAndFailureText) {
  hosted_.Inside([](StabilizerEffect& effect) {
    WorldBuffer output(96, 64, HX_FORMAT_ARGB8);
    const auto draw = [&](FrameStatus status, const char* text) {
      DrawBanner(effect, {status, text}, output.world());
    };
    for (int i = 0; i < 2; ++i) {
      draw(FrameStatus::PressAnalyze, "");
      draw(FrameStatus::AnalysisInProgress, "");
      draw(FrameStatus::AnalysisInProgress, "not a failure's text");
    }
    EXPECT_EQ(effect.GetBannerCache()->size(), 2u);
    for (const char* text : {"", "Lost.", "$$$/Key=Lost.", "Still lost."}) {
      draw(FrameStatus::GeneralFailure, text);
    }
    EXPECT_EQ(effect.GetBannerCache()->size(), 6u);
    const StatusRecord keyed{FrameStatus::GeneralFailure, "$$$/Key=Lost."};
    EXPECT_EQ(effect.GetBannerCache()->Get(keyed, "")->width(), BannerImage("Lost.", {}).width());
    EXPECT_TRUE(HostedEffect::OperationsOf([&] { draw(FrameStatus::None, ""); }).empty());
    // Suite, world, band, copy of the text, text: each may fail.
    for (const char* name :
         {"acquire " HX_WORLD_SUITE, "World.NewWorld", "transfer", "copy_world"}) {
      Operations::Get().FailNth(1, name);
      EXPECT_THROW(draw(FrameStatus::PressAnalyze, ""), std::int32_t) << name;
    }
    Operations::Get().FailNone();
  });
}

}  // namespace
}  // namespace kelp::analysis::effect
