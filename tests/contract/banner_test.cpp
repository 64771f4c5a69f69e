#include <algorithm>
#include <array>
#include <cmath>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "tests/support/held_work.h"
#include "tests/contract/played_plugin.h"

// What frames say about their status, by the banner that a user sees.

namespace calmframe::host {
namespace {

using namespace std::chrono_literals;
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
    for (const std::uint32_t den : {1u, 2u}) {
      for (const int depth : {8, 16, 32, -8, -16}) {  // negative: the direct path
        SCOPED_TRACE("1/" + std::to_string(den) + " at " + std::to_string(depth));
        const auto render = [&](bool hidden) {
          effect.SetParam(kHideBanner, hidden);
          const RenderRequest request{kShown, std::abs(depth), {1, den}};
          return Float(depth < 0 ? renderer->Direct(request) : renderer->Planned(request));
        };
        const auto shown = render(false), beneath = render(true);
        ASSERT_TRUE(shown && beneath);
        if (!look) {
          EXPECT_EQ(Difference(*shown, *beneath), 0);
          continue;
        }
        if (den == 1) {
          EXPECT_EQ(Difference(*beneath, *SourceFrame(effect, kShown)) < 0.6, !look->steadied);
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
    int wrong = 0;
    double darkest = 2, brightest = 0;
    const int edge = (last + 1 - first) / 5;
    for (int y = first; y <= last; y += y == first + edge ? last - first - 2 * edge : 1) {
      const float *over = shown.row<float>(y), *under = beneath.row<float>(y);
      for (int x = 0; x < width; ++x) {
        // How bright a colour of the band it is that was laid over the frame.
        double along = 0, square = 0;
        Colour band;
        for (int c = 0; c < 3; ++c) {
          const float *above = over + 4 * x, *below = under + 4 * x;
          band[c] = (above[1 + c] * above[0] - (1 - kOpacity) * below[1 + c] * below[0]) / kOpacity;
          along += band[c] * look.colour[c];
          square += look.colour[c] * look.colour[c];
        }
        const double bright = along / square;
        darkest = std::min(darkest, bright);
        brightest = std::max(brightest, bright);
        for (int c = 0; c < 3; ++c) wrong += std::abs(band[c] - bright * look.colour[c]) > 0.015;
      }
    }
    EXPECT_EQ(wrong, 0) << "colours";
    EXPECT_NEAR(brightest, 1, 0.02);
    EXPECT_NEAR(darkest, look.striped ? 0.8 : 1, 0.02);
  }
};

TEST_F(Banner, WorkThatIsUnderWayIsStriped) {
  Hold drawing, solving;
  SolveStages stages;
  ShakyClip clip{320, 240, 16, "held"};
  clip.on_draw = [&](std::int64_t frame) {
    if (frame == 6) drawing.Pass();
  };
  Effect& effect = session().Apply(MakeLayer(clip));
  ExpectBanner(effect, Look{kBlue, true});
  while (!drawing.Reached(5ms)) session().Tick();
  ExpectBanner(effect, Look{kBlue, true});
  stages.HoldAt("Begin - RunFactorization()", &solving);
  drawing.Release();
  while (!solving.Reached(5ms)) session().Tick();
  EXPECT_EQ(Session::StatusOf(effect), 5);
  ExpectBanner(effect, Look{kOrange, true});
  solving.Release();
  EXPECT_EQ(Settle(effect), 8);
  ExpectBanner(effect, {});

  Hold again;
  stages.HoldAt("Begin - RunFactorization()", &again);
  effect.SetParam(kSmoothness, 10);
  while (!again.Reached(5ms)) session().Tick();
  EXPECT_EQ(Session::StatusOf(effect), 6);
  ExpectBanner(effect, Look{kOrange, true});
  again.Release();
  EXPECT_EQ(Settle(effect), 8);
}

TEST_F(Banner, WhatWantsTheUsersAnalyzeIsFlat) {
  const auto layer = MakeLayer({320, 240, 26, "flat banners"});
  const auto place = [&](std::int32_t start, std::int32_t length) {
    layer->Change([=](LayerState& state) {
      state.start_frame = start;
      state.length = length;
    });
    session().Tick();
  };
  place(0, 16);
  Effect& effect = session().Apply(layer);
  ASSERT_TRUE(effect.Press(kCancel).ok());
  ASSERT_EQ(Settle(effect), 1);
  ExpectBanner(effect, Look{kBlue, false});  // nothing is analysed
  ASSERT_TRUE(effect.Press(kAnalyze).ok());
  ASSERT_EQ(Settle(effect), 8);
  place(0, 12);
  ExpectBanner(effect, {});  // a part of what was analysed
  place(0, 26);
  ExpectBanner(effect, Look{kBlue, false, true});  // the range has changed
  place(4, 16);
  ASSERT_TRUE(effect.Press(kAnalyze).ok());
  ASSERT_EQ(Settle(effect), 8);
  place(0, 16);
  ExpectBanner(effect, Look{kBlue, false});  // outside of the range
}

TEST_F(Banner, FailuresAreRed) {
  {
    Effect& effect = session().Apply(MakeLayer({320, 240, 16, "no frames"}));
    host().media().faults.null_frame = true;
    ASSERT_EQ(Settle(effect), 1);
    host().media().faults.null_frame = false;
    const std::vector<std::string> messages = effect.TakeMessages();
    ASSERT_FALSE(messages.empty());
    for (const std::string& message : messages) {
      EXPECT_EQ(message, "Error receiving synchronous frame.");
    }
    ExpectBanner(effect, Look{kRed, false});  // the analysis failed
    EXPECT_TRUE(effect.Press(kAnalyze).ok());
    EXPECT_EQ(Settle(effect), 8);
    ExpectBanner(effect, {});
    session().Remove(effect);
  }
  {
    SolveStages stages;
    stages.FailAt("Begin - RunCropper()");
    Effect& effect = session().Apply(MakeLayer({320, 240, 16, "not solved"}));
    EXPECT_EQ(Settle(effect), 10);
    EXPECT_FALSE(Enabled(effect, kAnalyze));
    ExpectBanner(effect, Look{kRed, false});
    EXPECT_EQ(Settle(effect), 10);  // it is not tried again
    stages.FailAt("");
    effect.SetParam(kSmoothness, 49);
    EXPECT_EQ(Settle(effect), 8);
    ExpectBanner(effect, {});
    session().Remove(effect);
  }
  {
    const auto layer = MakeLayer({320, 240, 16, "refused"});
    Effect& effect = session().Apply(layer);
    ASSERT_EQ(Settle(effect), 8);
    layer->Change([](LayerState& state) { state.refusal = "Not this layer."; });
    ExpectBanner(effect, Look{kRed, false});
    layer->Change([](LayerState& state) { state.refusal.clear(); });
    ExpectBanner(effect, {});
    session().Remove(effect);
  }
  {
    ShakyClip clip{320, 240, 16, "thrown about"};
    clip.tremor = 9;
    Effect& effect = session().Apply(MakeLayer(clip));
    effect.SetParam(kFraming, 2);
    ASSERT_EQ(Settle(effect), 8);
    ExpectBanner(effect, Look{kRed, false, true});  // over-cropped
    effect.SetParam(kFraming, 1);
    ASSERT_EQ(Settle(effect), 8);
    ExpectBanner(effect, {});
  }
}

}  // namespace
}  // namespace calmframe::host
