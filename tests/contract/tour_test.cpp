#include <gmock/gmock.h>

#include <algorithm>
#include <cstdlib>
#include <optional>
#include <string>
#include <vector>

#include "platform/tessel/debug.h"
#include "tests/contract/played_plugin.h"

// The real plug-in, played by the host as any plug-in is.

namespace calmframe::host {
namespace {

class Tour : public PlayedPlugin {
 protected:
  // The source's frame 7 is shown as it is, on both paths.
  static void ExpectSource(Effect& effect, Renderer& renderer) {
    for (const bool direct : {true, false}) {
      const RenderedFrame frame = Render(renderer, direct, {7});
      ASSERT_TRUE(frame.pixels);
      EXPECT_EQ(Difference(*frame.pixels, *SourceFrame(effect, 7)), 0);
    }
  }
};

TEST_F(Tour, AppliedItAnalysesSolvesAndSteadies) {
  // What a debug option shows beside is run by a test of its own.
  EXPECT_EQ(host().declarations().size(),
            tessel::debug::DebugDatabase::GetBool("ShowExperimentalEffectParameters") ? 98u : 31u);
  EXPECT_EQ(host().About().message,
            "Calmframe, v1.0\n\nStabilizes footage without manual tracking.");
  Effect& effect = session().Apply(MakeLayer());
  ASSERT_TRUE(effect.creation().ok());
  session().Tick();
  EXPECT_FALSE(Enabled(effect, kAnalyze));
  EXPECT_TRUE(Enabled(effect, kCancel));
  ASSERT_EQ(Settle(effect), kReady);
  EXPECT_EQ(Analysed(), 24u);
  EXPECT_FALSE(Enabled(effect, kAnalyze));
  EXPECT_FALSE(Enabled(effect, kCancel));
  EXPECT_EQ(host().user_interface().info().first, "Stabilization finished:");
  EXPECT_EQ(std::string(effect.Param(kAutoScale)->name).substr(0, 12), "Auto-scale (");
  EXPECT_TRUE(effect.TakeMessages().empty());

  const auto renderer = effect.MakeRenderer();
  double shaky = 0, steady = 0;
  std::shared_ptr<WorldBuffer> before, source_before;
  for (std::int64_t frame = 4; frame < 20; ++frame) {
    const RenderedFrame rendered = renderer->Planned({frame});
    ASSERT_TRUE(rendered.pixels) << rendered.result.Line("frame");
    const auto source = SourceFrame(effect, frame);
    if (before) {
      shaky += Difference(*source, *source_before, 24);
      steady += Difference(*rendered.pixels, *before, 24);
    }
    before = rendered.pixels;
    source_before = source;
  }
  // The pan stays, the tremor goes.
  EXPECT_LT(steady, 0.6 * shaky);
}

TEST_F(Tour, PathsDepthsAndPartsAgree) {
  Effect& effect = Steady({160, 120, 24, "small"});
  const auto renderer = effect.MakeRenderer();
  for (int framing = 1; framing <= 4; ++framing) {
    effect.SetParam(kFraming, framing);
    ASSERT_EQ(Settle(effect), kReady) << framing;
    EXPECT_EQ(exports().allow_cuda_rendering(effect.opaque_data()), framing != 4);
    for (const std::uint32_t den : {1u, 2u}) {
      SCOPED_TRACE(std::to_string(framing) + " at 1/" + std::to_string(den));
      const auto frame = [&](int depth, std::optional<HX_Rect> part = {}) {  // below 0: direct
        const RenderRequest request{7, std::abs(depth), {1, den}, part};
        return Render(*renderer, depth < 0, request).OnLayer();
      };
      const auto reference = frame(32), whole = frame(-8);
      // A fraction of a level: the depths' rounding.
      for (const int depth : {8, 16, -8, -16}) {
        EXPECT_LT(Difference(*reference, *frame(depth)), 0.6) << depth;
      }
      const HX_Rect part{20, 15, 55, 45};
      for (const int depth : {8, -8}) {
        WorldBuffer cut(35, 30, HX_FORMAT_ARGB8), same(35, 30, HX_FORMAT_ARGB8);
        CopyWorld(whole->world(), cut.world(), &part, nullptr);
        CopyWorld(frame(depth, part)->world(), same.world(), &part, nullptr);
        EXPECT_EQ(Difference(cut, same), 0) << depth;
      }
    }
  }
}

TEST_F(Tour, AnEffectBeneathMakesItStaleOneAboveDoesNot) {
  Effect& effect = Steady({96, 64, 8, "beneath"});
  const auto& layer = effect.shared()->layer();
  const EffectOperator other = OtherEffect();
  for (const std::size_t position : {1, 0}) {
    layer->InsertEffect(position, other);
    session().Tick();
    EXPECT_EQ(Enabled(effect, kAnalyze), position == 0);
    layer->RemoveEffect(other.runtime_id);
    session().Tick();
    EXPECT_FALSE(Enabled(effect, kAnalyze));
  }
}

TEST_F(Tour, ClipsOfAnyKindComeToAnEnd) {
  const struct {
    const char* name;
    std::int64_t frames;
    std::int32_t start, field_type;
    HX_Ratio aspect;
  } clips[] = {{"one frame", 1, 0, HX_FIELD_PROGRESSIVE, {1, 1}},
               {"two frames", 2, 0, HX_FIELD_PROGRESSIVE, {1, 1}},
               {"upper field first", 12, 0, 1, {1, 1}},
               {"lower field first", 12, 2, 2, {1, 1}},
               {"before its media", 20, -3, HX_FIELD_PROGRESSIVE, {1, 1}},
               {"anamorphic", 20, 0, HX_FIELD_PROGRESSIVE, {16, 15}}};
  for (const auto& clip : clips) {
    SCOPED_TRACE(clip.name);
    ShakyClip shaky{160, 120, clip.frames, clip.name};
    shaky.aspect = clip.aspect;
    const auto layer = MakeLayer(shaky);
    layer->Change([&](LayerState& state) {
      state.start_frame = clip.start;
      state.field_type = clip.field_type;
      state.length = static_cast<std::int32_t>(clip.frames) - std::max(clip.start, 0);
    });
    Effect& effect = session().Apply(layer);
    effect.SetParam(kFraming, 1);
    EXPECT_EQ(Settle(effect), kReady);
    EXPECT_TRUE(effect.TakeMessages().empty());
    const bool fields = clip.field_type != HX_FIELD_PROGRESSIVE;
    const auto data = DataOf(effect.opaque_data());
    // Of a layer that begins before its media what the media has.
    EXPECT_EQ(data[0], (fields ? 2 : 1) * (layer->state()->length + std::min(clip.start, 0)));
    EXPECT_EQ(data[1], (fields ? 2 : 1) * std::max(clip.start, 0));
    const auto renderer = effect.MakeRenderer();
    for (const bool direct : {false, true}) {
      RenderRequest request{std::max<std::int64_t>(-clip.start, 0)};
      EXPECT_TRUE(Render(*renderer, direct, request).pixels);
      request.second_field = fields;
      EXPECT_TRUE(Render(*renderer, direct, request).pixels);
    }
    session().Remove(effect);
  }
}

TEST_F(Tour, ASourceOfAnotherSizeIsToldOnceAndAnalysedAnew) {
  Effect& effect = Steady();
  Layer& layer = *effect.shared()->layer();
  const auto renderer = effect.MakeRenderer();
  layer.Resize(160, 120);
  for (int i = 0; i < 3; ++i) session().Tick();
  EXPECT_THAT(effect.TakeMessages(),
              testing::ElementsAre(testing::HasSubstr("from 320x240 to 160x120")));
  EXPECT_TRUE(renderer->Planned({7}).pixels);
  EXPECT_TRUE(Enabled(effect, kAnalyze));
  layer.Resize(1, 1);
  EXPECT_TRUE(effect.Press(kAnalyze).ok());
  for (int i = 0; i < 3; ++i) session().Tick();
  ExpectSource(effect, *renderer);
  layer.Resize(160, 120);
  EXPECT_TRUE(effect.Press(kAnalyze).ok());
  EXPECT_EQ(Settle(effect), kReady);
  EXPECT_TRUE(renderer->Planned({7}).pixels);
  EXPECT_TRUE(effect.TakeMessages().empty());
}

TEST_F(Tour, ALayerOfOnePixelDoesNothing) {
  const ShakyClip clip{1, 1, 8, "one pixel"};
  Effect& effect = session().Apply(MakeLayer(clip));
  EXPECT_TRUE(effect.creation().ok());
  EXPECT_EQ(Settle(effect), 0);
  EXPECT_TRUE(effect.Press(kAnalyze).ok());
  EXPECT_EQ(Settle(effect), 0);
  ExpectSource(effect, *effect.MakeRenderer());
  EXPECT_TRUE(session().Load(MakeLayer(clip), Saved(effect)).creation().ok());
}

TEST_F(Tour, EffectsOnOneClipShareAnAnalysis) {
  const auto requests = [this](const char* one, const char* other) {
    const std::uint64_t before = Analysed();
    Effect& a = session().Apply(MakeLayer({160, 120, 40, one}));
    Effect& b = session().Apply(MakeLayer({160, 120, 40, other}));
    EXPECT_EQ(Settle(a), kReady);
    EXPECT_EQ(Settle(b), kReady);
    session().Remove(a);
    session().Remove(b);
    return Analysed() - before;
  };
  EXPECT_LT(requests("a", "a"), 60u);
  EXPECT_EQ(requests("b", "c"), 80u);
}

// Nothing is written, started or drawn while nothing changes: parameters are read, and the layer's
// identity.
TEST_F(Tour, AtRestATickOnlyReads) {
  Effect& effect = Steady({96, 64, 8, "at rest"});
  session().Tick();
  const std::uint64_t generation = effect.shared()->generation();
  Operations::Get().Record(true);
  session().Tick();
  Operations::Get().Record(false);
  const std::vector<std::string> names = Operations::Get().recorded();
  EXPECT_LT(names.size(), 100u);
  for (const std::string& name : names) {
    const bool reads = name == "checkout_param" || name == "lock_handle" ||
                       name == "Analysis Host.GetRefusal" || name.rfind("acquire ", 0) == 0 ||
                       name.rfind("Utility.", 0) == 0 || name.rfind("String.", 0) == 0 ||
                       name.rfind("Sequence Info.", 0) == 0 || name.rfind("Video Segment.", 0) == 0;
    EXPECT_TRUE(reads) << name;
  }
  EXPECT_EQ(effect.shared()->generation(), generation);
}

}  // namespace
}  // namespace calmframe::host
