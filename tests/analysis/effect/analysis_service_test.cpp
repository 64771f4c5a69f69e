#include <gmock/gmock.h>

#include <filesystem>
#include <set>

#include "analysis/effect/pick_track_file.h"
#include "platform/tessel/debug.h"
#include "platform/tesselui/save_dialog.h"
#include "tests/analysis/effect/test_effect.h"

namespace kelp::analysis::effect {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::StartsWith;

using AnalysisServiceTest = EffectTest;

TEST_F(AnalysisServiceTest, AnAppliedEffectAnalysesItsClipByItself) {
  renderer_->callbacks = FakeRenderer::Callbacks::kHeld;
  ASSERT_EQ(Apply(), 0);
  ASSERT_TRUE(State()->analyzer);
  EXPECT_EQ(State()->analyzer->job_stage(), JobStage::NotStarted);
  EXPECT_TRUE(State()->source_identity.IsNil());
  EXPECT_EQ(Refresh(), 0);
  EXPECT_EQ(Label(), "Initializing...");
  EXPECT_EQ(Counter(), 0);

  EXPECT_EQ(Tick(), 0);
  EXPECT_EQ(State()->analyzer->job_stage(), JobStage::Started);
  EXPECT_EQ(Counter(), 104);
  EXPECT_FALSE(State()->source_identity.IsNil());
  EXPECT_TRUE(State()->first_analysis);
  const std::uint64_t started = State()->progress.start_tick;
  renderer_->WaitForHeld(2);
  EXPECT_EQ(Tick(), 0);
  EXPECT_EQ(State()->analyzer->job_stage(), JobStage::SeenRunning);
  EXPECT_GT(State()->progress.start_tick, started);  // the time left counts from here
  EXPECT_EQ(Label(), "0% (frame 1 of 4)");
  EXPECT_FALSE(Enabled(kAnalyzeAt));
  EXPECT_TRUE(Enabled(kCancelAt));
  EXPECT_EQ(Change(kAnalyzeAt), 0);  // pressed by a host that didn't look
  EXPECT_EQ(TestEffect::log.restarts, 1);

  renderer_->Resume();
  Settle();
  EXPECT_EQ(State()->all_features.frame_count, 4);
  EXPECT_EQ(State()->first_frame, 0);
  EXPECT_EQ(TestEffect::log.needs_solve, 1);
  EXPECT_EQ(Counter() % 100, 5);
  EXPECT_EQ(Label(), "");
  EXPECT_FALSE(Enabled(kAnalyzeAt));  // current
  EXPECT_FALSE(Enabled(kCancelAt));
  TestEffect effect(Context());
  EXPECT_TRUE(effect.IsAnalysisCurrent(State()));
  EXPECT_EQ(effect.GetStatusForFrame(2), FrameStatus::Ready);
  EXPECT_FALSE(effect.IsBusy());
}

TEST_F(AnalysisServiceTest, WhatChangesUpstreamOffersAnalyzeAgain) {
  ASSERT_EQ(Apply(), 0);
  Settle();
  ASSERT_EQ(State()->all_features.frame_count, 4);
  const std::string media = std::exchange(layer_.nodes[0].guid, "other media");
  EXPECT_EQ(Refresh(), 0);
  EXPECT_TRUE(Enabled(kAnalyzeAt));
  EXPECT_EQ(Tick(), 0);
  EXPECT_EQ(TestEffect::log.restarts, 0);  // by the user alone
  layer_.nodes[0].guid = media;
  EXPECT_EQ(Refresh(), 0);
  EXPECT_FALSE(Enabled(kAnalyzeAt));
  // What can't be learnt is no error either.
  layer_.failing["GetNodeGuid"] = 5;
  EXPECT_EQ(Refresh(), 0);
  EXPECT_TRUE(Enabled(kAnalyzeAt));
  EXPECT_FALSE(host_.ShowsMessage());
}

TEST_F(AnalysisServiceTest, CancelEndsTheJobAndTellsSo) {
  renderer_->callbacks = FakeRenderer::Callbacks::kHeld;
  ASSERT_EQ(Apply(), 0);
  ASSERT_EQ(Tick(), 0);
  renderer_->WaitForHeld(2);
  ASSERT_EQ(Tick(), 0);
  const boost::shared_ptr<Analyzer> analyzer = State()->analyzer;
  EXPECT_EQ(Change(kCancelAt), 0);
  EXPECT_FALSE(State()->analyzer);
  EXPECT_FALSE(analyzer->IsActive());
  EXPECT_EQ(Counter() % 100, 1);
  EXPECT_THAT(host_.info_text(), ElementsAre("Stabilizer analysis canceled."));
  EXPECT_TRUE(Enabled(kAnalyzeAt));
  EXPECT_FALSE(Enabled(kCancelAt));
  EXPECT_EQ(TestEffect::log.failed, 0);
  const int counter = Counter();
  EXPECT_EQ(Change(kCancelAt), 0);  // nothing is left to cancel
  EXPECT_EQ(Counter(), counter);
  EXPECT_EQ(Tick(), 0);
  EXPECT_FALSE(State()->analyzer);
}

TEST_F(AnalysisServiceTest, AFailedJobSaysWhyAndWaitsForTheUser) {
  renderer_->null_frames = true;
  ASSERT_EQ(Apply(), 0);
  ASSERT_EQ(Tick(), 0);
  std::string message;
  for (int i = 0; i < 20000 && Analyses(); ++i) {
    EXPECT_EQ(Tick(), 0);
    if (host_.ShowsMessage()) message = host_.out.return_msg;
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
  EXPECT_EQ(message, "Error receiving synchronous frame.");
  EXPECT_EQ(TestEffect::log.failed, 1);
  EXPECT_EQ(TestEffect::log.needs_solve, 0);
  EXPECT_EQ(Counter() % 100, 1);
  EXPECT_TRUE(Enabled(kAnalyzeAt));
  EXPECT_EQ(State()->all_features.frame_count, 0);
}

TEST_F(AnalysisServiceTest, WithoutMediaTheFirstTickFailsOnceAndAnalyzeIsOffered) {
  layer_.top = -1;
  ASSERT_EQ(Apply(), 0);
  EXPECT_EQ(Tick(), 1);
  EXPECT_STREQ(host_.out.return_msg, "unknown exception on frame 0 in Calmframe.");
  EXPECT_FALSE(State()->analyzer);
  EXPECT_EQ(Tick(), 0);
  EXPECT_EQ(Refresh(), 0);
  EXPECT_TRUE(Enabled(kAnalyzeAt));
}

TEST_F(AnalysisServiceTest, DetailedAnalysisStartsAgainOnce) {
  ASSERT_EQ(Apply(), 0);
  Settle();
  ASSERT_EQ(State()->all_features.frame_count, 4);
  EXPECT_EQ(TestEffect::log.restarts, 0);
  // The user's change starts at once, with other settings.
  host_.params[kDetailedAt].u.bd.value = 1;
  EXPECT_EQ(Change(kDetailedAt), 0);
  EXPECT_EQ(TestEffect::log.restarts, 1);
  EXPECT_EQ(State()->analyzer->record().selector_params.max_count, 2000u);
  Settle();
  EXPECT_EQ(State()->all_features.feature_count, 2000);

  // A tick that sees another value than the stored one does the same, where the analysis is
  // current; and a refused start is not repeated with each tick.
  State()->detailed = false;
  layer_.failing["ScheduleAnalysis"] = 77;
  EXPECT_EQ(Tick(), 77);
  EXPECT_EQ(TestEffect::log.restarts, 1);
  EXPECT_TRUE(Enabled(kAnalyzeAt));
  EXPECT_EQ(Tick(), 0);
  layer_.failing.clear();
  State()->detailed = false;
  EXPECT_EQ(Tick(), 0);
  EXPECT_EQ(TestEffect::log.restarts, 2);
  State()->detailed = boost::logic::indeterminate;  // differs from nothing
  Settle();
  EXPECT_EQ(TestEffect::log.restarts, 2);
}

TEST_F(AnalysisServiceTest, ARefusedLayerKeepsItsTextForTheUser) {
  layer_.refusal = u"Not this one.";
  EXPECT_EQ(Apply(), 0);
  EXPECT_STREQ(host_.out.return_msg, "Not this one.");
  EXPECT_TRUE(host_.ShowsMessage());
  EXPECT_FALSE(State()->analyzer);
  EXPECT_EQ(Change(kAnalyzeAt), HX_ERR_LAYER_REFUSED);
  EXPECT_STREQ(host_.out.return_msg, "Not this one.");
  EXPECT_EQ(TestEffect::log.restarts, 0);
  // Detailed Analysis finds it out later: the message is enough, and the buttons are given back.
  EXPECT_EQ(Change(kDetailedAt), 0);
  EXPECT_STREQ(host_.out.return_msg, "Not this one.");
  EXPECT_TRUE(Enabled(kAnalyzeAt));
  EXPECT_EQ(TestEffect::log.failed, 0);
}

TEST_F(AnalysisServiceTest, AQuietTickReadsItsParameterAndNothingElse) {
  ASSERT_EQ(Apply(), 0);
  Settle();
  host_.ForgetOperations();
  const int calls = layer_.calls;
  EXPECT_EQ(Tick(), 0);
  EXPECT_EQ(layer_.calls, calls);
  int reads = 0;
  for (const auto& operation : host_.operations()) {
    reads += operation.name == "checkout_param";
    EXPECT_TRUE(operation.name == "checkout_param" || operation.name == "lock_handle")
        << operation.name;
  }
  EXPECT_EQ(reads, 1);
}

TEST_F(AnalysisServiceTest, TheSaveButtonWritesTheTracksWhereTheUserSays) {
  const std::string path = ::testing::TempDir() + "analysis_service_test.trk";
  std::filesystem::remove(path);
  tesselui::InstallSaveDialog([&](const tesselui::SaveDialogRequest& request) {
    EXPECT_EQ(request.filter, "TRK Files (*.trk)");
    EXPECT_EQ(request.default_extension, "trk");
    return std::optional<std::string>(path);
  });
  ASSERT_EQ(Apply(), 0);
  EXPECT_EQ(Change(kSaveAt), 0);  // no frames yet
  EXPECT_FALSE(std::filesystem::exists(path));
  Settle();
  host_.params[kSaveAt].ui_flags = HX_PARAM_UI_DISABLED;
  EXPECT_EQ(Change(kSaveAt), 0);
  EXPECT_EQ(std::filesystem::file_size(path), 20u + 16 * 4 * 500);
  EXPECT_TRUE(Enabled(kSaveAt));
  std::filesystem::remove(path);

  std::string reported;
  tessel::debug::SetSink([&reported](const std::string& text) { reported += text; });
  PickFileAndSaveTracks(nullptr);
  tessel::debug::SetSink({});
  EXPECT_EQ(reported,
            "AnalysisUtils: kelp::analysis::PickFileAndSaveTracks: state or analysis NULL, try "
            "re-analyzing first\n");
  EXPECT_FALSE(std::filesystem::exists(path));

  tesselui::InstallSaveDialog({});  // a cancel
  host_.params[kSaveAt].ui_flags = HX_PARAM_UI_DISABLED;
  EXPECT_EQ(Change(kSaveAt), 0);
  EXPECT_TRUE(Enabled(kSaveAt));
  EXPECT_FALSE(std::filesystem::exists(path));
}

// Every operation of the host fails once, wherever it comes in a short life of an instance.
TEST_F(AnalysisServiceTest, AnInstanceSurvivesTheFailureOfAnyOperation) {
  layer_.count = 1;  // one small frame, so that a life is short
  layer_.nodes[0].properties[HX_PROPERTY_STREAM_WIDTH] = "40";
  layer_.nodes[0].properties[HX_PROPERTY_STREAM_HEIGHT] = "32";
  std::set<std::string> failed_operations;
  for (int n = 1;; ++n) {
    host_.ForgetOperations();
    host_.FailOperation(n);
    std::vector<HX_Err> codes{Apply(), Refresh(), Tick()};
    WaitForJob();  // so that no more ticks come than these
    for (int i = 0; i < 2; ++i) codes.push_back(Tick());
    codes.push_back(Change(kDetailedAt));
    codes.push_back(Tick());
    codes.push_back(Change(kCancelAt));
    codes.push_back(Call(HX_CMD_DESTROY_INSTANCE));
    tessel::threads::Shutdown();  // the job's own operations are over
    host_.FailOperation(0);
    std::string what;
    for (const auto& operation : host_.operations()) {
      if (operation.failed) what = operation.name;
    }
    for (const HX_Err code : codes) {
      EXPECT_TRUE(code == 0 || code == ::FakeHost::kFault || code == HX_ERR_MISSING_SUITE ||
                  code == HX_ERR_HANDLE_LOCK || code == HX_ERR_NO_INSTANCE)
          << code << " after " << what;
    }
    // Nothing stays behind, and the next life is as good as any.
    EXPECT_EQ(Call(HX_CMD_DESTROY_INSTANCE), 0) << what;
    EXPECT_EQ(host_.in.instance_handle, nullptr);
    tessel::threads::Shutdown();  // a job that the first one could not reach
    EXPECT_EQ(host_.Leaks(), "") << what;
    ASSERT_EQ(Apply(), 0) << what;
    ASSERT_TRUE(Analyses()) << what;
    EXPECT_EQ(Call(HX_CMD_DESTROY_INSTANCE), 0) << what;
    if (what.empty()) break;
    failed_operations.insert(what);
    ASSERT_LT(n, 1000);
  }
  for (const char* operation :
       {"new_handle", "lock_handle", "checkout_param", "Param Utils.UpdateParamUI",
        "Param Utils.SetParamValue", "Private Effect.ConvertText", "Private Effect.ForceRerender",
        "Adv App.InfoText", "Adv App.RefreshAllWindows", "acquire Analysis Host Suite 1",
        "acquire Rushbase Video Segment Render Suite 3", "acquire HX Utility Suite 3"}) {
    EXPECT_TRUE(failed_operations.count(operation)) << operation;
  }
  ASSERT_EQ(Apply(), 0);
  Settle();
  EXPECT_EQ(State()->all_features.frame_count, 1);
}

}  // namespace
}  // namespace kelp::analysis::effect
