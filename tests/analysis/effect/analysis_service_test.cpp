#include <gtest/gtest.h>

#include <set>

#include "stabilizer/effect/src/stabilizer_effect.h"
#include "tests/support/hosted_effect.h"

// The buttons and the idle step of an analysis. Cancelling and failing jobs, effects beneath,
// layers of one pixel, ticks at rest and operations that fail are in tests/contract.
namespace calmframe::host {
namespace {

using kelp::effect::SavedState;

void ExpectButtons(const HostedEffect& hosted, bool analyze, bool cancel,
                   const std::string& label = "") {
  EXPECT_EQ(hosted.Enabled(kAnalyze), analyze);
  EXPECT_EQ(hosted.Enabled(kCancel), cancel);
  EXPECT_EQ(hosted.Name(kCancel), label);
}

TEST(AnalysisServiceTest, AnAppliedEffectAnalysesItsClipByItself) {
  HostedEffect hosted(SmallClip("applied", 4));
  hosted.Apply();
  ExpectButtons(hosted, false, true, "Initializing...");
  EXPECT_EQ(hosted.Value(kStatusCounter), 0);
  hosted.HoldAtFrame(1);
  EXPECT_TRUE(hosted.Tick().ok());
  EXPECT_EQ(hosted.Value(kStatusCounter), 104);
  hosted.TickUntilHeld();
  EXPECT_TRUE(hosted.Tick().ok());
  ExpectButtons(hosted, false, true, "0% (frame 1 of 4)");
  EXPECT_FALSE(hosted.Press(kAnalyze).ok());
  hosted.Release();
  const std::uint64_t refreshes = hosted.host().user_interface().refreshes();
  EXPECT_EQ(hosted.Settle(), 8);
  ExpectButtons(hosted, false, false);
  EXPECT_EQ(hosted.host().user_interface().refreshes(), refreshes + 2) << "for tracks and warps";
}

TEST(AnalysisServiceTest, OfALayerThatBeginsBeforeItsMediaTheMediaIsAnalysed) {
  HostedEffect hosted(SmallClip("begins before", 8));
  hosted.Place(-3, 11);
  EXPECT_EQ(hosted.Analyse(), 8);
  ExpectButtons(hosted, false, false);
}

TEST(AnalysisServiceTest, WhatCantBeLearntUpstreamOffersAnalyzeAndIsNoError) {
  HostedEffect hosted(SmallClip());
  ASSERT_EQ(hosted.Analyse(), 8);
  calmframe::host::MediaFaults& faults = hosted.host().media().faults;
  const auto expect_faults_pass = [&] {
    EXPECT_TRUE(hosted.Tick().ok());
    ExpectButtons(hosted, true, false);
    EXPECT_EQ(hosted.Status(), 8) << "it is the user's to press";
    faults.identifier_failed = faults.node_missing = false;
    Operations::Get().FailNone();
    EXPECT_TRUE(hosted.Tick().ok());
    ExpectButtons(hosted, false, false);
  };
  faults.identifier_failed = true;
  Operations::Get().FailAlways("Video Segment.GetNodeGuid");
  expect_faults_pass();
  faults.node_missing = true;
  expect_faults_pass();
  EXPECT_TRUE(hosted.Messages().empty());
}

TEST(AnalysisServiceTest, WithoutMediaTheFirstTickFailsOnceAndAnalyzeIsOffered) {
  HostedEffect hosted(SmallClip());
  hosted.host().media().faults.node_missing = true;
  hosted.Apply();
  EXPECT_EQ(hosted.Tick().message, "unknown exception on frame 0 in Calmframe.");
  EXPECT_EQ(hosted.Status(), 1);
  EXPECT_TRUE(hosted.Tick().ok());
  ExpectButtons(hosted, true, false);
  hosted.host().media().faults.node_missing = false;
  EXPECT_TRUE(hosted.Press(kAnalyze).ok());
  EXPECT_EQ(hosted.Settle(), 8);
}

// A project may tell of another Detailed Analysis than its analysis is of: the tick finds it out.
TEST(AnalysisServiceTest, ATickStartsAgainWhereDetailedAnalysisIsNotWhatIsStored) {
  HostedEffect hosted(SmallClip());
  ASSERT_EQ(hosted.Analyse(), 8);
  const SavedEffect saved = hosted.Save();
  const SavedEffect other =
      hosted.Altered(saved, [](SavedState& state) { state.detailed = !state.detailed; });
  const SavedEffect unknown = hosted.Altered(
      saved, [](SavedState& state) { state.detailed = boost::logic::indeterminate; });
  hosted.Open(other);
  EXPECT_TRUE(hosted.Tick().ok());
  EXPECT_EQ(hosted.Status(), 4);
  EXPECT_EQ(hosted.Settle(), 8);

  // A refused start gives the buttons back, and is not tried again.
  hosted.Open(other);
  Operations::Get().FailAlways("Analysis Host.ScheduleAnalysis");
  EXPECT_EQ(hosted.Tick().code, kFaultCode);
  ExpectButtons(hosted, true, false);
  EXPECT_TRUE(hosted.Tick().ok());
  EXPECT_EQ(hosted.Status(), 8);
  Operations::Get().FailNone();
  EXPECT_EQ(hosted.Settle(), 8);
  EXPECT_FALSE(hosted.Warp(3).empty());

  hosted.Open(unknown);  // differs from nothing
  EXPECT_TRUE(hosted.Tick().ok());
  EXPECT_EQ(hosted.Status(), 8);
}

TEST(AnalysisServiceTest, TheUsersDetailedAnalysisTracksMore) {
  HostedEffect hosted(SmallClip());
  hosted.Apply();
  for (const bool detailed : {false, true}) {
    EXPECT_TRUE(hosted.Set(kDetailedAnalysis, detailed).ok());
    ASSERT_EQ(hosted.Settle(), 8);
    hosted.Inside([=](kelp::effect::StabilizerEffect& effect) {
      EXPECT_EQ(TableOf(*effect.GetState()).feature_count, detailed ? 2000 : 500);
    });
  }
}

// Whatever is refused while an analysis is ended or begun again, and whatever is refused once more:
// the host learns how it stands, and what was solved can still be changed.
TEST(AnalysisServiceTest, ARefusalLeavesNobodyWaiting) {
  HostedEffect hosted(SmallClip());
  const auto tour = [&hosted](const std::string& name, const std::function<void()>& act) {
    SCOPED_TRACE(name);
    Operations::Get().FailAlways(name);
    act();
    Operations::Get().FailNone();
    EXPECT_TRUE(hosted.Tick().ok());
    hosted.Messages();
    return hosted.Settle();
  };
  const auto running = [&hosted] {
    if (hosted.session().effects().size() > 0) hosted.Remove();
    hosted.Apply();
    hosted.Tick();
    EXPECT_EQ(hosted.Status(), 4);
  };
  for (const char* name : {"Adv App.InfoText", "acquire HX OV Adv App Suite"}) {
    running();
    EXPECT_EQ(tour(name, [&hosted] { EXPECT_FALSE(hosted.Press(kCancel).ok()); }), 1);
  }
  running();
  const auto names = HostedEffect::OperationsOf([&hosted] { hosted.Set(kDetailedAnalysis, 1); });
  for (const std::string& name : std::set<std::string>(names.begin(), names.end())) {
    running();
    const int status = tour(name, [&hosted] { hosted.Set(kDetailedAnalysis, 1); });
    EXPECT_TRUE(status == 1 || status == 8) << name << " " << status;
    if (status == 1) continue;
    const int again = tour(name, [&hosted] { hosted.Set(kDetailedAnalysis, 0); });
    if (again == 8) {
      EXPECT_NE(hosted.RunsFor(kSmoothness, 20), "") << name;
    }
  }
}

TEST(AnalysisServiceTest, AFailedJobIsToldOnce) {
  HostedEffect hosted(SmallClip());
  hosted.Apply();
  hosted.HoldAtFrame(0);
  hosted.TickUntilHeld();
  hosted.Tick();  // sees it run
  hosted.host().media().faults.null_frame = true;
  hosted.Release();
  EXPECT_EQ(hosted.Settle(), 1);
  EXPECT_EQ(hosted.Messages().size(), 1u);
  hosted.host().media().faults.null_frame = false;
}

TEST(AnalysisServiceTest, ALayerWithoutFramesIsToldAndLeftAlone) {
  HostedEffect hosted(SmallClip());
  const std::vector<std::string> text = {"The layer shows no frames to analyze."};
  hosted.Place(0, 0);
  EXPECT_TRUE(hosted.Apply().creation().ok());
  EXPECT_EQ(hosted.Messages(), text);
  EXPECT_EQ(hosted.Settle(), 0);
  hosted.Place(0, 8);
  hosted.Press(kAnalyze);
  EXPECT_EQ(hosted.Settle(), 8);
  hosted.Place(0, 0);
  EXPECT_TRUE(hosted.Set(kDetailedAnalysis, 1).ok());
  EXPECT_EQ(hosted.Messages(), text);
  EXPECT_FALSE(hosted.Warp(3).empty());
  // A job that is of no frames already, and ones of more than the layer shows, which don't begin.
  for (const auto& [times, steps, status] : {std::tuple{0, 1, 1}, {2, 1, 0}, {1, 2, 0}}) {
    hosted.Remove();
    hosted.Place(0, 8);
    hosted.Apply();
    hosted.Open(hosted.Altered(hosted.Save(), [times = times, steps = steps](SavedState& state) {
      state.job->job_guid = tessel::utility::Guid::MakeUnique();
      state.job->job_input_parameters.Duration.numerator *= times;
      state.job->job_input_parameters.StepTime.denominator *= steps;
    }));
    EXPECT_EQ(hosted.Settle(), status);
  }
}

// What a project says of an analysis that waits is of that analysis alone.
TEST(AnalysisServiceTest, ACancelledAnalysisOfAProjectIsPendingNoMore) {
  HostedEffect hosted(SmallClip());
  hosted.Apply();
  hosted.Open(hosted.Altered(hosted.Save(), [](SavedState& state) {
    ASSERT_TRUE(state.job);
    state.analysis_pending = true;
  }));
  EXPECT_TRUE(hosted.Press(kCancel).ok());
  hosted.Inside([](kelp::effect::StabilizerEffect& effect) {
    EXPECT_EQ(effect.GetStatusForFrame(0), kelp::analysis::FrameStatus::PressAnalyze);
  });
}

TEST(AnalysisServiceTest, ARefusedLayerKeepsItsTextForTheUser) {
  HostedEffect hosted(SmallClip());
  const std::vector<std::string> text = {"Not this one."};
  hosted.Refuse(text[0]);
  EXPECT_TRUE(hosted.Apply().creation().ok());
  EXPECT_EQ(hosted.Messages(), text);
  EXPECT_EQ(hosted.Press(kAnalyze).code, HX_ERR_LAYER_REFUSED);
  EXPECT_EQ(hosted.Messages(), text);
  // Detailed Analysis finds it out later: the message is enough.
  EXPECT_TRUE(hosted.Set(kDetailedAnalysis, 1).ok());
  EXPECT_EQ(hosted.Messages(), text);
  ExpectButtons(hosted, true, false);
  EXPECT_EQ(hosted.Status(), 0);
  hosted.Refuse("");
}

}  // namespace
}  // namespace calmframe::host
