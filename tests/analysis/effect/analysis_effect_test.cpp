#include "analysis/effect/analysis_effect.h"

#include "tests/analysis/effect/test_effect.h"

namespace kelp::analysis::effect {
namespace {

class AnalysisEffectTest : public EffectTest {
 protected:
  // A result of `frames` rows from `first` on, as an analysis of the present clip would give it.
  AnalysisState& GiveResult(int frames, int first) {
    AnalysisState& state = *State();
    state.EndAnalyzer(&host_.in, &host_.out);
    state.all_features.frame_count = frames;
    state.first_frame = first;
    state.job_input.FieldType = layer_.field;
    state.job_input.StepTime = {1, 25};
    state.job_input.StartTime = {first, 25};
    state.job_input.Duration = {frames, 25};
    return state;
  }
  FrameStatus StatusAt(std::int64_t frame) {
    return TestEffect(Context()).GetStatusForFrame(frame);
  }
  CurrentFrame FrameAt(int time, bool clamped) {
    host_.in.current_time = time;
    return TestEffect(Context()).GetCurrentFrame(clamped);
  }
};

TEST_F(AnalysisEffectTest, TheCounterTicksAtEachStatusAndEndsInIt) {
  TestEffect effect(Context());
  effect.PublishStatus(FrameStatus::None);
  EXPECT_EQ(Counter(), 0);
  for (int i = 0; i < 97; ++i) effect.PublishStatus(FrameStatus::PressAnalyze);
  EXPECT_EQ(Counter(), 9701);
  effect.PublishStatus(FrameStatus::Ready);
  EXPECT_EQ(Counter(), 9808);
  host_.params[kCounterAt].u.fs.value = 2e9;
  effect.PublishStatus(FrameStatus::OverCropped);
  EXPECT_EQ(Counter(), 112);
}

TEST_F(AnalysisEffectTest, ButtonsAreUpdatedOnlyWhenTheyChange) {
  ASSERT_EQ(Apply(), 0);
  TestEffect effect(Context());
  effect.UpdateStartStopButtonEnablement(false, true, "37% (frame 12 of 30, which is long)");
  EXPECT_FALSE(Enabled(kAnalyzeAt));
  EXPECT_TRUE(Enabled(kCancelAt));
  EXPECT_EQ(Label(), "37% (frame 12 of 30, which is l");  // 31 bytes
  EXPECT_EQ(host_.params[kAnalyzeAt].flags, 0x140u);      // as declared
  host_.ForgetOperations();
  effect.UpdateStartStopButtonEnablement(false, true, "37% (frame 12 of 30, which is long)");
  for (const auto& operation : host_.operations()) EXPECT_EQ(operation.name, "lock_handle");
  effect.UpdateStartStopButtonEnablement(true, false, nullptr);
  EXPECT_EQ(Updates(), 2);
  EXPECT_EQ(Label(), "");
  EXPECT_TRUE(Enabled(kAnalyzeAt));
  EXPECT_FALSE(Enabled(kCancelAt));
}

TEST_F(AnalysisEffectTest, UndeclaredParametersCostNoCall) {
  TestEffect effect(Context());
  host_.ForgetOperations();
  EXPECT_EQ(effect.GetIntParam(kMaxIterationsParam), 25);
  EXPECT_FALSE(effect.GetBoolParam(kShowTracksParam));
  EXPECT_TRUE(host_.operations().empty());
  host_.params[kDetailedAt].u.bd.value = 1;
  EXPECT_EQ(effect.GetSelectorParams().max_count, 2000u);
  EXPECT_EQ(effect.GetTrackerParams().half_win_x, 12u);
  for (const auto& operation : host_.operations()) EXPECT_EQ(operation.name, "checkout_param");
}

TEST_F(AnalysisEffectTest, TheCurrentFrameIsTheLayersTimeBehindItsInPoint) {
  EXPECT_FALSE(FrameAt(0, true).valid);  // no instance
  ASSERT_EQ(Apply(), 0);
  EXPECT_FALSE(FrameAt(0, true).valid);  // no frames
  layer_.start = 10;
  host_.in.time_scale = 50;
  host_.in.total_time = 40;
  GiveResult(20, 10);
  EXPECT_EQ(FrameAt(6, true).frame, 13);     // 6/50 s are 3 frames of 1/25 s
  EXPECT_EQ(FrameAt(7, true).frame, 13);     // rounded down
  EXPECT_EQ(FrameAt(-30, true).frame, 10);   // the layer's first
  EXPECT_EQ(FrameAt(-30, false).frame, 0);   // -15 + 10 is before all frames
  EXPECT_EQ(FrameAt(500, false).frame, 29);  // the last analysed one is repeated
  layer_.start = -3;
  EXPECT_EQ(FrameAt(2, true).frame, 1);  // an in-point before the media counts as 0

  State()->job_input.FieldType = 1;  // rows are fields
  layer_.start = 10;
  State()->all_features.frame_count = 40;
  EXPECT_EQ(FrameAt(7, true).frame, 27);  // 7 half frames behind 2 * 10
  layer_.failing["GetStartFrame"] = 5;
  EXPECT_FALSE(FrameAt(7, true).valid);
}

TEST_F(AnalysisEffectTest, AStatusTellsHowFarTheStoredAnalysisFits) {
  EXPECT_EQ(StatusAt(0), FrameStatus::PressAnalyze);  // no state
  ASSERT_EQ(Apply(), 0);
  EXPECT_EQ(StatusAt(0), FrameStatus::AnalysisInProgress);
  layer_.start = 5;
  layer_.count = 4;
  GiveResult(8, 4);
  EXPECT_EQ(StatusAt(5), FrameStatus::Ready);  // trimmed on both sides
  EXPECT_EQ(StatusAt(12), FrameStatus::OutsideRange);
  layer_.count = 8;
  EXPECT_EQ(StatusAt(5), FrameStatus::RangeChanged);

  TestEffect effect(Context());
  host_.in.total_time = 100;
  FrameAt(1, true);
  EXPECT_TRUE(effect.IsRenderableFrame());
  EXPECT_TRUE(effect.NeedsOverlayOrBanner());
  State()->first_frame = 7;  // frame 6 lies outside
  EXPECT_FALSE(effect.IsRenderableFrame());

  layer_.refusal = u"This clip is a still.";
  EXPECT_EQ(StatusAt(5), FrameStatus::GeneralFailure);
  EXPECT_FALSE(host_.ShowsMessage());
  EXPECT_STREQ(host_.out.return_msg, "");
  EXPECT_EQ(effect.GetStatusRecord(),
            (StatusRecord{FrameStatus::GeneralFailure, "This clip is a still."}));
  EXPECT_FALSE(effect.IsRenderableFrame());
}

TEST_F(AnalysisEffectTest, AOneByOneInstanceDoesNothing) {
  host_.in.width = host_.in.height = 1;
  EXPECT_EQ(Apply(), 0);
  EXPECT_TRUE(host_.in.instance_handle);
  EXPECT_EQ(State(), nullptr);
  for (int index : {kAnalyzeAt, kCancelAt, kDetailedAt}) EXPECT_EQ(Change(index), 0);
  EXPECT_EQ(Tick(), 0);
  EXPECT_EQ(TestEffect::log.restarts, 0);
  EXPECT_EQ(Counter(), 0);
  // The clip comes back: the state is made by the press of Analyze.
  host_.in.width = kWidth;
  host_.in.height = kHeight;
  EXPECT_EQ(StatusAt(0), FrameStatus::PressAnalyze);
  EXPECT_EQ(Change(kAnalyzeAt), 0);
  ASSERT_NE(State(), nullptr);
  EXPECT_TRUE(State()->analyzer);
}

TEST_F(AnalysisEffectTest, ARendersCopyLeavesTheJobAlone) {
  renderer_->callbacks = FakeRenderer::Callbacks::kHeld;
  ASSERT_EQ(Apply(), 0);
  ASSERT_EQ(Tick(), 0);
  const boost::shared_ptr<Analyzer> analyzer = State()->analyzer;
  const HX_Handle own = std::exchange(host_.in.instance_handle, nullptr);
  {
    host_.Prepare();
    TestEffect copy(Context());
    copy.CreateInstanceState(true);
    copy.GetState()->analyzer = analyzer;
    EXPECT_TRUE(copy.IsBusy());
    copy.TeardownInstance();
    EXPECT_EQ(host_.in.instance_handle, nullptr);
  }
  EXPECT_TRUE(analyzer->IsActive());
  host_.in.instance_handle = own;
}

}  // namespace
}  // namespace kelp::analysis::effect
