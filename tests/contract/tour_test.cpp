#include <algorithm>
#include <string>
#include <utility>
#include <vector>

#include "platform/tessel/debug.h"
#include "tests/support/held_work.h"
#include "tests/contract/played_plugin.h"

// The real plug-in, played by the host as any plug-in is.

namespace calmframe::host {
namespace {

class Tour : public PlayedPlugin {
 protected:
  // The outside renderer's view.
  const void* WarpOf(Effect& effect, std::int32_t frame) {
    return host().library().exports().get_var_vector(effect.opaque_data(), frame);
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
  ASSERT_EQ(Settle(effect), 8);
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
  Effect& effect = session().Apply(MakeLayer());
  ASSERT_EQ(Settle(effect), 8);
  const auto renderer = effect.MakeRenderer();
  for (int framing = 1; framing <= 4; ++framing) {
    effect.SetParam(kFraming, framing);
    ASSERT_EQ(Settle(effect), 8) << framing;
    EXPECT_EQ(host().library().exports().allow_cuda_rendering(effect.opaque_data()), framing != 4);
    for (const std::uint32_t den : {1u, 2u}) {
      const HX_Ratio ratio{1, den};
      const RenderedFrame reference = renderer->Planned({7, 32, ratio});
      const RenderedFrame whole = renderer->Direct({7, 8, ratio});
      ASSERT_TRUE(reference.pixels && whole.pixels) << framing;
      // A fraction of a level: the depths' rounding.
      EXPECT_LT(Difference(*reference.OnLayer(), *whole.OnLayer()), 0.6) << framing << " " << den;
      for (const int depth : {8, 16}) {
        EXPECT_LT(Difference(*reference.OnLayer(), *renderer->Planned({7, depth, ratio}).OnLayer()),
                  0.6)
            << framing << " " << den << " " << depth;
        EXPECT_LT(Difference(*reference.OnLayer(), *renderer->Direct({7, depth, ratio}).OnLayer()),
                  0.6)
            << framing << " " << den << " " << depth;
      }
      RenderRequest part{7, 8, ratio};
      part.part = HX_Rect{40, 30, 110, 90};
      for (const bool direct : {true, false}) {
        const RenderedFrame piece = direct ? renderer->Direct(part) : renderer->Planned(part);
        ASSERT_TRUE(piece.pixels);
        WorldBuffer cut(70, 60, HX_FORMAT_ARGB8), same(70, 60, HX_FORMAT_ARGB8);
        CopyWorld(whole.OnLayer()->world(), cut.world(), &*part.part, nullptr);
        CopyWorld(piece.OnLayer()->world(), same.world(), &*part.part, nullptr);
        EXPECT_EQ(Difference(cut, same), 0) << framing << " " << den << " " << direct;
      }
    }
  }
}

TEST_F(Tour, SmoothnessSolvesAgainAndMaximumScaleOnlyFrames) {
  SolveStages stages;
  Effect& effect = session().Apply(MakeLayer());
  ASSERT_EQ(Settle(effect), 8);
  EXPECT_EQ(stages.Take(), "factorization crop ");
  const void* warp = WarpOf(effect, 5);
  ASSERT_TRUE(warp);
  const std::pair<std::int32_t, double> framings[] = {
      {kMaximumScale, 101}, {kMaximumScale, 150}, {kFraming, 2}, {kCropLessSmoothMore, 100}};
  for (const auto& [index, value] : framings) {
    effect.SetParam(index, value);
    ASSERT_EQ(Settle(effect), 8) << index << " " << value;
    EXPECT_EQ(stages.Take(), "crop ") << index << " " << value;
    EXPECT_EQ(WarpOf(effect, 5), warp) << index << " " << value;
  }
  effect.SetParam(kSmoothness, 10);
  ASSERT_EQ(Settle(effect), 8);
  EXPECT_EQ(stages.Take(), "factorization crop ");
  EXPECT_NE(WarpOf(effect, 5), warp);
}

// In front of the analysed range stands the source below a banner; behind it the last frame
// repeats.
TEST_F(Tour, TrimmedAndExtendedFramesTellTheirState) {
  const auto layer = MakeLayer();
  layer->Change([](LayerState& state) {
    state.start_frame = 4;
    state.length = 14;
  });
  Effect& effect = session().Apply(layer);
  ASSERT_EQ(Settle(effect), 8);
  const auto renderer = effect.MakeRenderer();
  // By the source's frame.
  const auto shown = [&](std::int64_t frame) {
    return renderer->Planned({frame - layer->state()->start_frame}).OnLayer();
  };
  const auto place = [&](std::int32_t start, std::int32_t length) {
    layer->Change([=](LayerState& state) {
      state.start_frame = start;
      state.length = length;
    });
    session().Tick();
  };
  const auto steady = shown(10), last = shown(17);
  place(4, 20);
  EXPECT_TRUE(Enabled(effect, kAnalyze));
  EXPECT_GT(Difference(*shown(10), *steady), 0);  // the banner
  EXPECT_TRUE(effect.SetParam(kHideBanner, 1).ok());
  EXPECT_EQ(Difference(*shown(10), *steady), 0);
  EXPECT_EQ(Difference(*shown(20), *last), 0);
  place(0, 18);
  EXPECT_EQ(Difference(*shown(2), *SourceFrame(effect, 2)), 0);
  EXPECT_TRUE(effect.SetParam(kHideBanner, 0).ok());
  EXPECT_GT(Difference(*shown(2), *SourceFrame(effect, 2)), 0);
  place(4, 14);
  EXPECT_FALSE(Enabled(effect, kAnalyze));
  EXPECT_EQ(Difference(*shown(10), *steady), 0);
}

TEST_F(Tour, AnEffectBeneathMakesItStaleOneAboveDoesNot) {
  const auto layer = MakeLayer();
  Effect& effect = session().Apply(layer);
  ASSERT_EQ(Settle(effect), 8);
  EffectOperator other;
  other.runtime_id = NewRuntimeId();
  other.match_name = "Other";
  layer->InsertEffect(1, other);
  session().Tick();
  EXPECT_FALSE(Enabled(effect, kAnalyze));
  layer->RemoveEffect(other.runtime_id);
  layer->InsertEffect(0, other);
  session().Tick();
  EXPECT_TRUE(Enabled(effect, kAnalyze));
  layer->RemoveEffect(other.runtime_id);
  session().Tick();
  EXPECT_FALSE(Enabled(effect, kAnalyze));
}

TEST_F(Tour, DetailedAnalysisStartsAnalysisAtOnce) {
  Effect& effect = session().Apply(MakeLayer());
  ASSERT_EQ(Settle(effect), 8);
  ASSERT_TRUE(effect.SetParam(kDetailedAnalysis, 1).ok());
  session().Tick();
  EXPECT_EQ(Session::WorkOf(effect), Session::Work::analysing);
  EXPECT_EQ(Settle(effect), 8);
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
    EXPECT_EQ(Settle(effect), 8);
    EXPECT_TRUE(effect.TakeMessages().empty());
    const bool fields = clip.field_type != HX_FIELD_PROGRESSIVE;
    std::int32_t rows = 0, first = 0, other[6];
    float bounds[4];
    EXPECT_TRUE(host().library().exports().get_stabilizer_data(
        effect.opaque_data(), &rows, &first, &other[0], &other[1], &other[2], &other[3], &bounds[0],
        &bounds[1], &bounds[2], &bounds[3], &other[4], &other[5]));
    EXPECT_EQ(rows, (fields ? 2 : 1) * layer->state()->length);
    EXPECT_EQ(first, (fields ? 2 : 1) * std::max(clip.start, 0));
    const auto renderer = effect.MakeRenderer();
    for (const bool second : {false, true}) {
      RenderRequest request{std::max<std::int64_t>(-clip.start, 0)};
      request.second_field = second && fields;
      EXPECT_TRUE(renderer->Planned(request).pixels);
      EXPECT_TRUE(renderer->Direct(request).pixels);
    }
    session().Remove(effect);
  }
}

TEST_F(Tour, ASourceOfAnotherSizeIsToldOnceAndAnalysedAnew) {
  const auto layer = MakeLayer();
  Effect& effect = session().Apply(layer);
  ASSERT_EQ(Settle(effect), 8);
  const auto renderer = effect.MakeRenderer();
  layer->Resize(160, 120);
  for (int i = 0; i < 3; ++i) session().Tick();
  const std::vector<std::string> messages = effect.TakeMessages();
  ASSERT_EQ(messages.size(), 1u);
  EXPECT_NE(messages[0].find("from 320x240 to 160x120"), std::string::npos) << messages[0];
  EXPECT_TRUE(renderer->Planned({7}).pixels);
  EXPECT_TRUE(Enabled(effect, kAnalyze));
  layer->Resize(1, 1);
  EXPECT_TRUE(effect.Press(kAnalyze).ok());
  for (int i = 0; i < 3; ++i) session().Tick();
  for (const bool direct : {true, false}) {
    const RenderedFrame frame = direct ? renderer->Direct({7}) : renderer->Planned({7});
    ASSERT_TRUE(frame.pixels);
    EXPECT_EQ(Difference(*frame.pixels, *SourceFrame(effect, 7)), 0);
  }
  layer->Resize(160, 120);
  EXPECT_TRUE(effect.Press(kAnalyze).ok());
  EXPECT_EQ(Settle(effect), 8);
  EXPECT_TRUE(renderer->Planned({7}).pixels);
  EXPECT_TRUE(effect.TakeMessages().empty());
}

TEST_F(Tour, ALayerOfOnePixelDoesNothing) {
  Effect& effect = session().Apply(MakeLayer({1, 1, 5, "one pixel"}));
  EXPECT_TRUE(effect.creation().ok());
  EXPECT_EQ(Settle(effect), 0);
  EXPECT_TRUE(effect.Press(kAnalyze).ok());
  EXPECT_EQ(Settle(effect), 0);
  const auto renderer = effect.MakeRenderer();
  for (const bool direct : {true, false}) {
    const RenderedFrame frame = direct ? renderer->Direct({2}) : renderer->Planned({2});
    ASSERT_TRUE(frame.pixels);
    EXPECT_EQ(Difference(*frame.pixels, *SourceFrame(effect, 2)), 0);
  }
  SavedEffect saved;
  EXPECT_TRUE(effect.Save(&saved).ok());
  EXPECT_TRUE(session().Load(MakeLayer({1, 1, 5, "one pixel"}), saved).creation().ok());
}

TEST_F(Tour, ARefusedLayerShowsWhy) {
  const auto layer = MakeLayer();
  Effect& effect = session().Apply(layer);
  ASSERT_EQ(Settle(effect), 8);
  const auto renderer = effect.MakeRenderer();
  const auto steady = renderer->Planned({10}).OnLayer();
  layer->Change([](LayerState& state) { state.refusal = "Not this layer."; });
  session().Tick();
  EXPECT_TRUE(Enabled(effect, kAnalyze));
  const auto refused = renderer->Planned({10}).OnLayer();
  EXPECT_GT(Difference(*refused, *SourceFrame(effect, 10)), 0);  // the banner
  EXPECT_LT(Difference(*refused, *SourceFrame(effect, 10)), Difference(*refused, *steady));
  effect.Press(kAnalyze);
  const std::vector<std::string> messages = effect.TakeMessages();
  ASSERT_EQ(messages.size(), 1u);
  EXPECT_NE(messages[0].find("Not this layer."), std::string::npos) << messages[0];
  layer->Change([](LayerState& state) { state.refusal.clear(); });
  EXPECT_TRUE(effect.Press(kAnalyze).ok());
  EXPECT_EQ(Settle(effect), 8);
}

TEST_F(Tour, EffectsOnOneClipShareAnAnalysis) {
  const auto requests = [this](const std::vector<boost::shared_ptr<Layer>>& layers) {
    Operations::Get().Record(true);
    std::vector<Effect*> effects;
    for (const auto& layer : layers) effects.push_back(&session().Apply(layer));
    for (Effect* effect : effects) EXPECT_EQ(Settle(*effect), 8);
    Operations::Get().Record(false);
    for (Effect* effect : effects) session().Remove(*effect);
    std::int64_t count = 0;
    for (const std::string& name : Operations::Get().recorded()) {
      count += name == "Video Segment Render.RenderAsync" ? 1 : 0;
    }
    return count;
  };
  const ShakyClip a{160, 120, 40, "a"}, b{160, 120, 40, "b"};
  const std::int64_t one = requests({MakeLayer(a)});
  EXPECT_GE(one, 40);
  const ShakyClip c{160, 120, 40, "c"}, d{160, 120, 40, "d"};
  EXPECT_LT(requests({MakeLayer(c), MakeLayer(c)}), one * 3 / 2);
  EXPECT_GE(requests({MakeLayer(b), MakeLayer(d)}), one * 2);
}

// Nothing is written, started or drawn while nothing changes: parameters are read, and the layer's
// identity.
TEST_F(Tour, AtRestATickOnlyReads) {
  Effect& effect = session().Apply(MakeLayer());
  ASSERT_EQ(Settle(effect), 8);
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

TEST_F(Tour, SavedAndLoadedItGoesOn) {
  Effect& effect = session().Apply(MakeLayer());
  ASSERT_EQ(Settle(effect), 8);
  effect.SetParam(kFraming, 1);
  SavedEffect saved;
  ASSERT_TRUE(effect.Save(&saved).ok());
  EXPECT_EQ(saved.match_name, "KLPX SubspaceStabilizer");
  EXPECT_FALSE(saved.instance.empty());
  Effect& loaded = session().Load(MakeLayer(), saved);
  EXPECT_TRUE(loaded.creation().ok());
  EXPECT_EQ(*ValueOf(*loaded.Param(kFraming)), 1);
  Effect* copy = session().Duplicate(effect, effect.shared()->layer());
  ASSERT_TRUE(copy);
  for (Effect* one : {&effect, &loaded, copy}) {
    EXPECT_EQ(Settle(*one), 8);
    EXPECT_EQ(Enabled(*one, kAnalyze), one == copy) << "another effect stands beneath the copy";
    EXPECT_TRUE(one->MakeRenderer()->Planned({3}).pixels);
  }
}

}  // namespace
}  // namespace calmframe::host
