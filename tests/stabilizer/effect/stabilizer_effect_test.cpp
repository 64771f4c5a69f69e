#include "stabilizer/effect/src/stabilizer_effect.h"

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <thread>

#include "tests/support/hosted_effect.h"
#include "tests/support/shifting_warper.h"

namespace calmframe::host {
namespace {

using kelp::effect::SolvePhase;
using kelp::effect::StabilizerEffect;
using kelp::effect::StabilizerState;

// Of frames 5 to 12 of the source.
TEST(StabilizerEffectTest, StatusOfAFrame) {
  using enum kelp::analysis::FrameStatus;
  HostedEffect hosted(SmallClip("statuses", 20));
  hosted.Place(5, 8);
  ASSERT_EQ(hosted.Analyse(), 8);
  // After a change of what the instance keeps; where the layer stands is looked up with each call.
  const auto expect = [&](std::int64_t frame, kelp::analysis::FrameStatus status,
                          const std::function<void(StabilizerEffect&, StabilizerState&)>& change) {
    hosted.Inside([&](StabilizerEffect& effect) {
      change(effect, *effect.GetState());
      EXPECT_EQ(effect.GetStatusForFrame(frame), status) << frame;
    });
  };
  const auto none = [](auto&, auto&) {};
  expect(5, Ready, none);
  expect(12, SolveInProgress, [](auto& effect, auto& state) {
    effect.MarkNeedsSolve();
    state.first_analysis = true;
  });
  expect(12, SubsequentSolve, [](auto&, auto& state) { state.first_analysis = false; });
  expect(12, SubsequentSolveOnDeletion, [](auto&, auto& state) { state.subsequent_solve = true; });
  expect(12, SubsequentSolve, [](auto& effect, auto&) { effect.MarkNeedsSolve(); });
  for (const std::int64_t outside : {4, 13}) {
    expect(outside, OutsideRange, none);
    expect(outside, TrackingFailed, [](auto& effect, auto&) { effect.MarkAnalysisFailed(); });
    expect(outside, OutsideRange, [](auto&, auto& state) { state.phase = SolvePhase::None; });
  }
  expect(5, SolveFailed, [](auto&, auto& state) { state.phase = SolvePhase::Failed; });
  hosted.Place(5, 10);
  expect(5, SolveFailed, none);
  expect(5, RangeChanged, [](auto&, auto& state) {
    state.phase = SolvePhase::Solved;
    state.needs_solve = false;
  });
  hosted.Place(6, 4);
  expect(6, Ready, none);
  expect(6, OverCropped, [](auto& effect, auto& state) {
    KeepCrop(state, boost::make_shared<cropper>(1, 96, 64));
    EXPECT_TRUE(effect.IsFinishedStatus(OverCropped));
  });
  hosted.Set(kFraming, 1);
  expect(6, Ready, none);
  expect(6, AnalysisInProgress, [](auto&, auto& state) { state.analysis_pending = true; });
  hosted.Refuse("No footage.");
  expect(6, GeneralFailure, [](auto&, auto& state) { state.analysis_pending = false; });
  hosted.Inside([](StabilizerEffect& effect) {
    const kelp::analysis::effect::StatusRecord told{GeneralFailure, "No footage."};
    EXPECT_EQ(effect.GetStatusRecord(), told);
    EXPECT_FALSE(effect.IsRenderableFrame());
  });
  EXPECT_TRUE(hosted.Messages().empty()) << "the banner tells it";
  hosted.Refuse("");
  expect(6, PressAnalyze, [](auto&, auto& state) { KeepTable(state, {}); });
  expect(6, TrackingFailed, [](auto& effect, auto&) { effect.MarkAnalysisFailed(); });
}

TEST(StabilizerEffectTest, AnalyzeStartsAnewAndDropsWhatWasSolved) {
  HostedEffect hosted(SmallClip("analysed again", 10));
  hosted.Place(0, 8);
  ASSERT_EQ(hosted.Analyse(), 8);
  hosted.Place(0, 10);
  hosted.Tick();
  EXPECT_FALSE(hosted.Warp(3).empty());
  ASSERT_TRUE(hosted.Press(kAnalyze).ok());
  EXPECT_EQ(hosted.Status(), 4);
  EXPECT_TRUE(hosted.Warp(3).empty());
  hosted.stages().Take();
  EXPECT_EQ(hosted.Runs(), "factorization crop ");
  EXPECT_FALSE(hosted.Warp(9).empty());
}

TEST(StabilizerEffectTest, NoMemoryForTheHandle) {
  HostedEffect hosted(SmallClip());
  Operations::Get().FailNth(1, "new_handle");
  EXPECT_EQ(hosted.Apply().creation().code, HX_ERR_NO_INSTANCE);
  EXPECT_EQ(hosted.Messages().at(0), "Not enough memory to allocate stabilizer data.");
}

// A renderer's instance takes over what runs, and leaves it alone.
TEST(StabilizerEffectTest, RenderersComeAndGoDuringAnAnalysis) {
  HostedEffect hosted(SmallClip());
  hosted.Apply();
  hosted.HoldAtFrame(6);
  hosted.TickUntilHeld();
  EXPECT_TRUE(hosted.effect().MakeRenderer()->Planned({0}).pixels);
  EXPECT_EQ(hosted.Status(), 4);
  EXPECT_EQ(hosted.Info().first, "") << "nothing was cancelled";
  hosted.Release();
  EXPECT_EQ(hosted.Settle(), 8);
}

TEST(StabilizerEffectTest, AnOutsideRendererDrawsWhatIsSolvedAndWaitsForWhatIsNot) {
  HostedEffect hosted(SmallClip());
  ASSERT_EQ(hosted.Analyse(), 8);
  EXPECT_TRUE(hosted.AllowsOutside());
  hosted.HoldSolve();
  hosted.Set(kSmoothness, 20);
  hosted.TickUntilHeld();
  EXPECT_FALSE(hosted.AllowsOutside());
  hosted.Release();
  EXPECT_EQ(hosted.Settle(), 8);
  EXPECT_TRUE(hosted.AllowsOutside());
  hosted.Inside([](StabilizerEffect& effect) {
    KeepCrop(*effect.GetState(), {});
    effect.PublishSharedData();
  });
  EXPECT_FALSE(hosted.AllowsOutside()) << "nothing to crop by";
  hosted.Set(kFraming, 1);
  hosted.Tick();
  EXPECT_TRUE(hosted.AllowsOutside());
}

// The clip comes while nobody has a block yet: each of the renders makes one, and one is kept.
TEST(StabilizerEffectTest, RendersThatAttachAtOnceShareOneBlock) {
  HostedEffect hosted(ShakyClip{1, 1, 4, "one pixel"});
  hosted.Apply();
  for (int round = 0; round < 20; ++round) {
    hosted.layer().Resize(1, 1);
    std::vector<std::unique_ptr<Renderer>> renderers;
    for (int i = 0; i < 4; ++i) renderers.push_back(hosted.effect().MakeRenderer());
    hosted.layer().Resize(96, 64);
    {
      std::vector<std::jthread> threads;
      for (const auto& renderer : renderers) {
        threads.emplace_back([&] { EXPECT_TRUE(renderer->Planned({2}).pixels); });
      }
    }
    EXPECT_EQ(hosted.host().opaque_data().uses(), 4u);
    renderers.clear();
    EXPECT_EQ(hosted.host().opaque_data().uses(), 0u);
  }
}

}  // namespace
}  // namespace calmframe::host
