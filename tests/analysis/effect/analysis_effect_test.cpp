#include "analysis/effect/analysis_effect.h"

#include <gtest/gtest.h>

#include "analysis/effect/analysis_parameter_rows.h"
#include "effect/parameter_row.h"
#include "stabilizer/effect/src/stabilizer_effect.h"
#include "tests/support/hosted_effect.h"

// Operations that every analysing effect has, on the stabilizer. Which status a frame has is in the
// stabilizer's own test.
namespace calmframe::host {
namespace {

using kelp::analysis::FrameStatus;
using kelp::effect::StabilizerEffect;
using namespace kelp::analysis::effect;

TEST(AnalysisEffectTest, TheCounterTicksAtEachStatusAndEndsInIt) {
  HostedEffect hosted(SmallClip());
  hosted.Apply();
  hosted.Inside([&](StabilizerEffect& effect) {
    const auto counter = [&] { return hosted.Value(kStatusCounter); };
    effect.PublishStatus(FrameStatus::None);
    EXPECT_EQ(counter(), 0);
    for (int i = 0; i < 97; ++i) effect.PublishStatus(FrameStatus::PressAnalyze);
    EXPECT_EQ(counter(), 9701);
    effect.PublishStatus(FrameStatus::Ready);
    EXPECT_EQ(counter(), 9808);
    hosted.effect().shared()->params().SetValues({{Session::kStatusDiskId, 2e9}});
    effect.PublishStatus(FrameStatus::OverCropped);
    EXPECT_EQ(counter(), 112);
  });
}

TEST(AnalysisEffectTest, UndeclaredParametersCostNoCall) {
  if (kelp::effect::ShowsExperimentalParameters()) GTEST_SKIP();
  HostedEffect hosted(SmallClip());
  hosted.Apply();
  hosted.effect().shared()->params().SetByUser(kDetailedAnalysis, 1);
  hosted.Inside([](StabilizerEffect& effect) {
    EXPECT_TRUE(HostedEffect::OperationsOf([&] {
                  EXPECT_EQ(effect.GetIntParam(kMaxIterationsParam), 25);
                  EXPECT_FALSE(effect.GetBoolParam(kShowTracksParam));
                  EXPECT_EQ(effect.GetIntParam(kRank), 9);
                }).empty());
    for (const std::string& name : HostedEffect::OperationsOf([&] {
           EXPECT_EQ(effect.GetSelectorParams().max_count, 2000u);
           EXPECT_EQ(effect.GetTrackerParams().half_win_x, 12u);
         })) {
      EXPECT_EQ(name, "checkout_param");
    }
  });
}

TEST(AnalysisEffectTest, TheCurrentFrameIsTheLayersTimeBehindItsInPoint) {
  HostedEffect hosted(SmallClip("frames", 30));
  hosted.Place(10, 20);
  hosted.Apply();
  const auto frame_at = [&](int start, int time, bool clamped) {
    hosted.Place(start, 20);
    CurrentFrame frame;
    hosted.Inside([&](StabilizerEffect& effect) {
      HX_InData& in = *effect.context().in;
      in.time_scale = 50;
      in.total_time = 40;
      in.current_time = time;
      frame = effect.GetCurrentFrame(clamped);
    });
    return frame;
  };
  EXPECT_FALSE(frame_at(10, 0, true).valid);  // nothing is analysed
  ASSERT_EQ(hosted.Settle(), 8);
  const struct {
    int start, time;
    bool clamped;
    std::int64_t frame;
  } cases[] = {
      {10, 6, true, 13},     // 6/50 s are 3 frames of 1/25 s
      {10, 7, true, 13},     // rounded down
      {10, -30, true, 10},   // the layer's first
      {10, -30, false, 0},   // -15 + 10 is before all frames
      {10, 500, false, 29},  // the last analysed one is repeated
      {2, 40, true, 22},     // an in-point that was moved forward leaves the analysed ones apart
      {-3, 12, true, 3},     // three frames lie before the media
      {-3, 2, true, 0},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(frame_at(c.start, c.time, c.clamped).frame, c.frame) << c.start << " " << c.time;
  }
  hosted.Inside([](StabilizerEffect& effect) {
    kelp::analysis::Replace(effect.GetState()->result, [](auto& result) {
      result.job_input.FieldType = 1;  // rows are fields
      result.all_features.frame_count = 40;
    });
  });
  EXPECT_EQ(frame_at(10, 7, true).frame, 27);  // 7 half frames behind 2 * 10
  Operations::Get().FailAlways("Utility.GetStartFrame");
  EXPECT_FALSE(frame_at(10, 7, true).valid);
  Operations::Get().FailNone();
}

}  // namespace
}  // namespace calmframe::host
