#include "stabilizer/effect/src/stabilizer_effect.h"

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>

#include "tests/stabilizer/effect/stabilizer_host.h"

namespace kelp::effect {
namespace {

using analysis::FrameStatus;

TEST(StabilizerEffectTest, DeclaresTheVisibleParameters) {
  StabilizerHost test;
  EXPECT_EQ(test.host.params.size(), 31u);
  EXPECT_EQ(test.Name(kSmoothnessIndex), "Smoothness");
  EXPECT_EQ(test.Name(kSynthesisInputRangeIndex), "Synthesis Input Range (seconds)");
  EXPECT_STREQ(test.host.params[kFramingIndex].u.pd.items,
               "Stabilize Only|Stabilize, Crop|Stabilize, Crop, Auto-scale|Stabilize, Synthesize "
               "Edges");
  EXPECT_STREQ(test.host.params[kAnalyzeIndex].u.button.label, "Analyze");
  EXPECT_EQ(test.host.params[kCancelIndex].disk_id, 11);
  // A hidden parameter costs no call of the host.
  test.host.ForgetOperations();
  EXPECT_EQ(test.Effect().GetIntParam(59), 9);
  EXPECT_TRUE(test.host.operations().empty());
}

TEST(StabilizerEffectTest, StatusOfAFrame) {
  StabilizerHost test(20);
  test.layer.start = 5;
  StabilizerState& state = test.Analysed(ShakenTable(20, 4));
  StabilizerEffect effect = test.Effect();
  const auto at = [&](std::int64_t frame) { return effect.GetStatusForFrame(frame); };

  EXPECT_EQ(at(5), FrameStatus::SolveInProgress);
  state.first_analysis = false;
  EXPECT_EQ(at(24), FrameStatus::SubsequentSolve);
  state.subsequent_solve = true;
  EXPECT_EQ(at(24), FrameStatus::SubsequentSolveOnDeletion);
  effect.MarkNeedsSolve();
  EXPECT_EQ(at(24), FrameStatus::SubsequentSolve);
  for (const std::int64_t outside : {4, 25}) {
    EXPECT_EQ(at(outside), FrameStatus::OutsideRange);
    effect.MarkAnalysisFailed();
    EXPECT_EQ(at(outside), FrameStatus::TrackingFailed);
    state.phase = SolvePhase::None;
  }
  state.phase = SolvePhase::Failed;
  EXPECT_EQ(at(5), FrameStatus::SolveFailed);
  test.layer.count = 30;
  EXPECT_EQ(at(5), FrameStatus::SolveFailed);
  state.phase = SolvePhase::Solved;
  state.needs_solve = false;
  EXPECT_EQ(at(5), FrameStatus::RangeChanged);
  test.layer.count = 10;
  EXPECT_EQ(at(5), FrameStatus::Ready);

  state.warper = ShiftingWarper(640, 360, {{0, 0}});
  state.crop = boost::make_shared<cropper>(1, 640, 360);
  EXPECT_EQ(at(5), FrameStatus::OverCropped);
  EXPECT_TRUE(effect.IsFinishedStatus(FrameStatus::OverCropped));
  test.Set(kFramingIndex, static_cast<int>(Framing::stabilize_only));
  EXPECT_EQ(at(5), FrameStatus::Ready);

  state.analysis_pending = true;
  EXPECT_EQ(at(5), FrameStatus::AnalysisInProgress);
  state.analysis_pending = false;
  test.layer.refusal = u"No footage.";
  EXPECT_EQ(at(5), FrameStatus::GeneralFailure);
  EXPECT_EQ(state.error_text, "No footage.");
  EXPECT_FALSE(test.host.ShowsMessage());
  test.layer.refusal.clear();

  state.all_features = {};
  EXPECT_EQ(at(5), FrameStatus::PressAnalyze);
  effect.MarkAnalysisFailed();
  EXPECT_EQ(at(5), FrameStatus::TrackingFailed);
}

// What Analyze makes: a state of its own, whose analysis waits for the next tick.
TEST(StabilizerEffectTest, AnalyzeStartsAnewAndDropsWhatWasSolved) {
  StabilizerHost test;
  test.Analysed(ShakenTable(20, 40));
  test.TickUntilSolved();
  ASSERT_TRUE(test.state()->warper);
  HX_ParamChangedExtra analyze{kAnalyzeIndex};
  ASSERT_EQ(test.Call(HX_CMD_PARAM_CHANGED, nullptr, &analyze), HX_ERR_NONE);
  EXPECT_FALSE(test.state()->warper);
  EXPECT_TRUE(test.state()->analyzer);
  EXPECT_TRUE(test.Effect().IsBusy());
  EXPECT_EQ(test.Status(), 4);
  EXPECT_EQ(test.Effect().GetStatusForFrame(0), FrameStatus::AnalysisInProgress);
  EXPECT_EQ(test.opaque_uses, 1);
}

TEST(StabilizerEffectTest, NoMemoryForTheHandle) {
  StabilizerHost test;
  test.host.ForgetOperations();
  test.host.FailOperation(1);
  EXPECT_EQ(test.Call(HX_CMD_CREATE_INSTANCE), HX_ERR_NO_INSTANCE);
  EXPECT_EQ(test.host.operations().front().name, "new_handle");
  EXPECT_STREQ(test.host.out.return_msg, "Not enough memory to allocate stabilizer data.");
  EXPECT_EQ(test.host.in.instance_handle, nullptr);
}

TEST(StabilizerEffectTest, AOneByOneSourceKeepsNoState) {
  StabilizerHost test;
  test.host.in.width = test.host.in.height = 1;
  ASSERT_EQ(test.Call(HX_CMD_CREATE_INSTANCE), HX_ERR_NONE);
  EXPECT_NE(test.host.in.instance_handle, nullptr);
  EXPECT_EQ(test.state(), nullptr);
  EXPECT_EQ(test.opaque_uses, 0);
  for (const std::int32_t index : {1, 2, 17}) {
    HX_ParamChangedExtra changed{index};
    EXPECT_EQ(test.Call(HX_CMD_PARAM_CHANGED, nullptr, &changed), HX_ERR_NONE);
  }
  EXPECT_EQ(test.Call(HX_CMD_REFRESH_PARAMS), HX_ERR_NONE);
  EXPECT_EQ(test.Tick(), HX_ERR_NONE);
  EXPECT_EQ(test.state(), nullptr);
}

}  // namespace
}  // namespace kelp::effect
