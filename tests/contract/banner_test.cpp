#include <gmock/gmock.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <optional>
#include <string>

#include "tests/contract/played_plugin.h"
#include "tests/support/held_work.h"

// What frames say about their status, by the banner that a user sees.

namespace calmframe::host {
namespace {

using Colour = std::array<double, 3>;

constexpr Colour kBlue{0.00784, 0.25098, 1.0}, kOrange{0.8, 0.33333, 0.0}, kRed{0.77255, 0.0, 0.0};
constexpr double kOpacity = 204 / 255.0;
constexpr std::int64_t kShown = 3;  // frame

struct Look {
  Colour colour;
  bool striped;  // with a second colour of four fifths of the first
  // What is under the banner; else the source.
  bool steadied = false;
};

class Banner : public PlayedPlugin {
 protected:
  static std::shared_ptr<WorldBuffer> Float(const RenderedFrame& frame) {
    if (!frame.pixels) return nullptr;
    const auto shown = frame.OnLayer();
    auto copy =
        std::make_shared<WorldBuffer>(shown->world().width, shown->world().height, HX_FORMAT_ARGBF);
    CopyWorld(shown->world(), copy->world(), nullptr, nullptr);
    return copy;
  }

  // The banner at each depth, on both paths and at two scales, against what lies beneath it; no
  // look: there is none.
  void ExpectBanner(Effect& effect, const std::optional<Look>& look) {
    const auto renderer = effect.MakeRenderer();
    const std::int64_t shown_of_source = kShown + effect.shared()->layer()->state()->start_frame;
    for (const std::uint32_t den : {1u, 2u}) {
      for (const int depth : {8, 16, 32, -8, -16}) {  // negative: the direct path
        SCOPED_TRACE("1/" + std::to_string(den) + " at " + std::to_string(depth));
        const auto render = [&](bool hidden) {
          effect.SetParam(kHideBanner, hidden);
          const RenderedFrame frame =
              Render(*renderer, depth < 0, {kShown, std::abs(depth), {1, den}});
          EXPECT_EQ(frame.banner.empty(), !look) << frame.banner;
          return Float(frame);
        };
        const auto shown = render(false), beneath = render(true);
        ASSERT_TRUE(shown && beneath);
        if (!look) {
          EXPECT_EQ(Difference(*shown, *beneath), 0);
          continue;
        }
        if (den == 1) {
          EXPECT_EQ(Difference(*beneath, *SourceFrame(effect, shown_of_source)) < 0.6,
                    !look->steadied);
        }
        ExpectBand(*shown, *beneath, *look);
      }
    }
    effect.SetParam(kHideBanner, 0);
  }

  // Above and below the text, which fills its middle half, there is the band alone.
  static void ExpectBand(const WorldBuffer& shown, const WorldBuffer& beneath, const Look& look) {
    const int width = shown.world().width, height = shown.world().height;
    const auto differs = [&](int y) {
      return !std::equal(shown.row<float>(y), shown.row<float>(y) + 4 * width,
                         beneath.row<float>(y));
    };
    int first = 0, last = height - 1;
    while (first < height && !differs(first)) ++first;
    while (last >= 0 && !differs(last)) --last;
    ASSERT_GT(last - first, 4);
    // A little above the middle.
    EXPECT_LT(first + last, height);
    EXPECT_GT(first + last, height / 2);
    const std::size_t strongest =
        std::max_element(look.colour.begin(), look.colour.end()) - look.colour.begin();
    int wrong = 0;
    double darkest = 2, brightest = 0;
    const int edge = (last + 1 - first) / 5;
    for (int y = first; y <= last; y += y == first + edge ? last - first - 2 * edge : 1) {
      const float *over = shown.row<float>(y), *under = beneath.row<float>(y);
      // What was laid over the frame.
      const auto laid = [&](int x, std::size_t c) {
        const float *above = over + 4 * x, *below = under + 4 * x;
        return (above[1 + c] * above[0] - (1 - kOpacity) * below[1 + c] * below[0]) / kOpacity;
      };
      for (int x = 0; x < width; ++x) {
        const double bright = laid(x, strongest) / look.colour[strongest];
        darkest = std::min(darkest, bright);
        brightest = std::max(brightest, bright);
        for (std::size_t c = 0; c < 3; ++c) {
          wrong += std::abs(laid(x, c) - bright * look.colour[c]) > 0.015;
        }
      }
    }
    EXPECT_EQ(wrong, 0) << "colours";
    EXPECT_NEAR(brightest, 1, 0.02);
    EXPECT_NEAR(darkest, look.striped ? 0.8 : 1, 0.02);
  }
};

TEST_F(Banner, WorkThatIsUnderWayIsStriped) {
  Hold drawing, solving[2];
  SolveStages stages;
  ShakyClip clip{320, 240, 16, "held"};
  clip.on_draw = [&](std::int64_t frame) {
    if (frame == 6) drawing.Pass();
  };
  Effect& effect = session().Apply(MakeLayer(clip));
  ExpectBanner(effect, Look{kBlue, true});
  while (!drawing.Reached(5ms)) session().Tick();
  ExpectBanner(effect, Look{kBlue, true});
  for (const int solve : {0, 1}) {  // the first and a later one
    stages.HoldAt("Begin - RunFactorization()", &solving[solve]);
    effect.SetParam(kSmoothness, 10 + solve);
    drawing.Release();
    while (!solving[solve].Reached(5ms)) session().Tick();
    EXPECT_EQ(Session::StatusOf(effect), 5 + solve);
    ExpectBanner(effect, Look{kOrange, true});
    solving[solve].Release();
    EXPECT_EQ(Settle(effect), kReady);
    ExpectBanner(effect, {});
  }
}

TEST_F(Banner, WhatWantsTheUsersAnalyzeIsFlat) {
  const auto layer = MakeLayer({320, 240, 26, "flat banners"});
  Trim(*layer, 4, 14);
  Effect& effect = session().Apply(layer);
  ASSERT_TRUE(effect.Press(kCancel).ok());
  ASSERT_EQ(Settle(effect), 1);
  ExpectBanner(effect, Look{kBlue, false});  // nothing is analysed
  ASSERT_TRUE(effect.Press(kAnalyze).ok());
  ASSERT_EQ(Settle(effect), kReady);
  const auto renderer = effect.MakeRenderer();
  const auto beneath = [&](std::int64_t source_frame) {
    effect.SetParam(kHideBanner, 1);
    return renderer->Planned({source_frame - layer->state()->start_frame}).OnLayer();
  };
  const auto steady = beneath(10), last = beneath(17);
  const struct {
    const char* name;
    std::int32_t start, length;
    std::optional<Look> look;
  } places[] = {{"a part of what was analysed", 4, 10, {}},
                {"the range has changed", 4, 20, Look{kBlue, false, true}},
                {"in front of the range", 0, 18, Look{kBlue, false}},
                {"as it was", 4, 14, {}}};
  for (const auto& place : places) {
    SCOPED_TRACE(place.name);
    Trim(*layer, place.start, place.length);
    EXPECT_EQ(Enabled(effect, kAnalyze), place.length != 14);
    ExpectBanner(effect, place.look);
    EXPECT_EQ(Difference(*beneath(10), *steady), 0);
    // Behind the range the last frame repeats, in front of it stands the source.
    if (place.length == 20) {
      EXPECT_EQ(Difference(*beneath(20), *last), 0);
    }
    if (place.start == 0) {
      EXPECT_EQ(Difference(*beneath(2), *SourceFrame(effect, 2)), 0);
    }
  }
  const SourcePtr analysed = layer->state()->source;
  for (const bool other : {true, false}) {
    layer->ReplaceMedia(other ? MakeShakyClip({320, 240, 26, "other footage"}) : analysed);
    session().Tick();
    EXPECT_EQ(Enabled(effect, kAnalyze), other);
    EXPECT_EQ(Session::StatusOf(effect), other ? 3 : kReady);
    EXPECT_EQ(exports().allow_cuda_rendering(effect.opaque_data()), !other);
    ExpectBanner(effect, other ? std::optional(Look{kBlue, false, true}) : std::nullopt);
  }
}

TEST_F(Banner, FailuresAreRed) {
  SolveStages stages;
  const auto layer = MakeLayer({320, 240, 16, "thrown about", 9});
  Effect& effect = session().Apply(layer);
  host().media().faults.null_frame = true;
  ASSERT_EQ(Settle(effect), 1);
  host().media().faults.null_frame = false;
  const auto messages = effect.TakeMessages();
  EXPECT_THAT(messages, testing::Each("Error receiving synchronous frame."));
  EXPECT_FALSE(messages.empty());
  ExpectBanner(effect, Look{kRed, false});  // the analysis failed

  stages.FailAt("Begin - RunCropper()");
  EXPECT_TRUE(effect.Press(kAnalyze).ok());
  EXPECT_EQ(Settle(effect), 10);
  EXPECT_FALSE(Enabled(effect, kAnalyze));
  ExpectBanner(effect, Look{kRed, false});
  EXPECT_EQ(Settle(effect), 10);  // it is not tried again
  stages.FailAt("");
  effect.SetParam(kSmoothness, 49);
  effect.SetParam(kFraming, 1);
  EXPECT_EQ(Settle(effect), kReady);
  ExpectBanner(effect, {});

  Refuse(*layer, "Not this layer.");
  ExpectBanner(effect, Look{kRed, false});
  session().Tick();
  EXPECT_TRUE(Enabled(effect, kAnalyze));
  effect.Press(kAnalyze);
  EXPECT_THAT(effect.TakeMessages(), testing::ElementsAre(testing::HasSubstr("Not this layer.")));
  Refuse(*layer, "");
  ExpectBanner(effect, {});

  effect.SetParam(kFraming, 2);
  EXPECT_EQ(Settle(effect), kReady);
  ExpectBanner(effect, Look{kRed, false, true});  // over-cropped
  effect.SetParam(kFraming, 1);
  EXPECT_EQ(Settle(effect), kReady);
  ExpectBanner(effect, {});
}

}  // namespace
}  // namespace calmframe::host
