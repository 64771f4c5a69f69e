#include <gtest/gtest.h>

#include <atomic>
#include <boost/make_shared.hpp>
#include <cmath>
#include <mutex>
#include <thread>

#include "platform/tessel/debug.h"
#include "stabilizer/effect/src/stabilizer_effect.h"
#include "tests/stabilizer/effect/stabilizer_host.h"

namespace kelp::effect {
namespace {

using analysis::FrameStatus;

// Which stages of a solve have run since the last look.
class Stages {
 public:
  Stages() {
    tessel::debug::DebugDatabase::Set("Trace.Subspace Stabilizer", 5);
    tessel::debug::SetSink([this](const std::string& text) {
      const std::lock_guard<std::mutex> lock(mutex_);
      text_ += text;
    });
  }
  ~Stages() {
    tessel::debug::SetSink({});
    tessel::debug::DebugDatabase::Set("Trace.Subspace Stabilizer", 0);
  }
  std::string Take() {
    const std::lock_guard<std::mutex> lock(mutex_);
    std::string stages;
    if (text_.find("Begin - RunFactorization()") != std::string::npos) stages += "factorization ";
    if (text_.find("Begin - RunCropper()") != std::string::npos) stages += "crop ";
    text_.clear();
    return stages;
  }
  // While it lives, a solve waits at its next stage.
  std::unique_lock<std::mutex> Hold() { return std::unique_lock<std::mutex>(mutex_); }

 private:
  std::mutex mutex_;
  std::string text_;
};

class SolveServiceTest : public ::testing::Test {
 protected:
  void Solve() {
    test.TickUntilSolved();
    stages.Take();
  }
  // What a tick, and all that it leads to, runs after a change.
  std::string RunsFor(std::int32_t index, double value) {
    test.Set(index, value);
    test.TickUntilSolved();
    return stages.Take();
  }

  StabilizerHost test;
  Stages stages;
};

TEST_F(SolveServiceTest, TheFirstSolveIsToldFromItsBeginningToItsEnd) {
  StabilizerState& state = test.Analysed(ShakenTable(20, 40));
  auto hold = stages.Hold();
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  ASSERT_TRUE(state.solver);
  EXPECT_EQ(test.Status(), 5);
  EXPECT_TRUE(test.Effect().IsBusy());
  const int rerenders = test.host.rerenders();
  hold.unlock();
  state.solver->Wait();
  EXPECT_GT(test.host.rerenders(), rerenders) << "the solve brings the host back";
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  EXPECT_FALSE(state.solver);
  EXPECT_EQ(state.phase, SolvePhase::Solved);
  EXPECT_EQ(state.warper->frameWarpCount(), 20u);
  EXPECT_TRUE(state.crop);
  EXPECT_EQ(test.Status(), 8);
  EXPECT_FALSE(test.Effect().IsBusy());
  const std::vector<std::string> info = test.host.info_text();
  ASSERT_EQ(info.size(), 2u);
  EXPECT_EQ(info[0], "Stabilization finished:");
  EXPECT_EQ(info[1], "0:00");
  EXPECT_EQ(test.Name(kStabilizationGroupIndex), "Stabilization");
  EXPECT_EQ(test.Effect().GetStatusForFrame(0), FrameStatus::Ready);
}

TEST_F(SolveServiceTest, HashesDecideWhatAChangeCallsFor) {
  test.Analysed(ShakenTable(20, 40));
  Solve();
  const auto warper = test.state()->warper;
  EXPECT_EQ(RunsFor(kMaximumScaleIndex, 120), "crop ");
  EXPECT_EQ(RunsFor(kFramingIndex, 2), "crop ");
  EXPECT_EQ(RunsFor(kFramingIndex, 3), "crop ");
  EXPECT_EQ(RunsFor(kCropLessSmoothMoreIndex, 100), "crop ");
  EXPECT_EQ(test.state()->warper->frameWarp(3), warper->frameWarp(3)) << "the same warps";
  for (const std::int32_t index :
       {kAdditionalScaleIndex, kHideWarningBannerIndex, kSynthesisLeftIndex}) {
    EXPECT_EQ(RunsFor(index, 1), "") << index;
  }
  EXPECT_EQ(RunsFor(kFramingIndex, 1), "");
  EXPECT_EQ(RunsFor(kFramingIndex, 3), "") << "nothing has changed since";
  EXPECT_EQ(RunsFor(kSmoothnessIndex, 20), "factorization crop ");
  EXPECT_NE(test.state()->warper->frameWarp(3), warper->frameWarp(3));
  EXPECT_EQ(RunsFor(kResultIndex, 2), "factorization crop ");
  EXPECT_EQ(RunsFor(kMethodIndex, 2), "factorization crop ");
  EXPECT_EQ(test.Status(), 8);
  EXPECT_TRUE(test.host.info_text().empty()) << "a later solve clears the panel";
}

TEST_F(SolveServiceTest, EdgeSynthesisWantsAFrameMapThatIsWideEnough) {
  test.Analysed(ShakenTable(20, 40));
  Solve();
  EXPECT_EQ(RunsFor(kFramingIndex, 4), "");
  EXPECT_EQ(test.state()->FrameMapRadius(), 13u);  // half a second at 25
  EXPECT_FALSE(test.state()->crop);
  const auto warper = test.state()->warper;
  RunsFor(kSynthesisInputRangeIndex, 0.3);
  EXPECT_EQ(test.state()->warper, warper) << "the map at hand will do";
  EXPECT_EQ(RunsFor(kSynthesisInputRangeIndex, 0.6), "");
  EXPECT_EQ(test.state()->FrameMapRadius(), 15u);
  EXPECT_EQ(RunsFor(kFramingIndex, 3), "crop ");
  EXPECT_EQ(test.state()->FrameMapRadius(), 0u);
}

TEST_F(SolveServiceTest, AFailedSolveStaysFailedUntilSomethingChanges) {
  StabilizerState& state = test.Analysed(ShakenTable(20, 40));
  const auto good = state.all_features;
  state.all_features.features =
      boost::make_shared<std::vector<marrow::tracking::tracking_feature<float>>>(*good.features);
  for (auto& cell : *state.all_features.features) cell.x = std::nanf("");
  Solve();
  EXPECT_EQ(state.phase, SolvePhase::Failed);
  EXPECT_FALSE(state.warper);
  EXPECT_EQ(test.Status(), 10);
  for (int i = 0; i < 3; ++i) ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  EXPECT_EQ(stages.Take(), "") << "it isn't tried again by itself";
  EXPECT_EQ(test.Status(), 10);
  state.all_features = good;
  EXPECT_EQ(RunsFor(kMaximumScaleIndex, 200), "factorization crop ") << "no warps to re-frame";
  EXPECT_EQ(test.Status(), 8);
}

TEST_F(SolveServiceTest, ASolveAtWorkIsKeptUnlessItsInputsChange) {
  StabilizerState& state = test.Analysed(ShakenTable(400, 200));
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  const Solver* const first = state.solver.get();
  while (first->GetState() == Solver::not_started) std::this_thread::yield();
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  EXPECT_EQ(state.solver.get(), first);
  EXPECT_EQ(test.Name(kStabilizationGroupIndex).substr(0, 13), "Stabilization");
  EXPECT_EQ(test.Name(kStabilizationGroupIndex).size(), 16u);
  test.Set(kSmoothnessIndex, 30);
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  ASSERT_TRUE(state.solver);
  EXPECT_EQ(state.solver->inputs().parameters.smoothness_lambda, 120);
  EXPECT_EQ(test.Status(), 5);
}

TEST_F(SolveServiceTest, WarpsOfOlderTracksAreNotReused) {
  StabilizerState& state = test.Analysed(ShakenTable(20, 40));
  Solve();
  state.MakeResultIdentityUnique();  // as a new analysis does
  test.Effect().MarkNeedsSolve();
  test.TickUntilSolved();
  EXPECT_EQ(stages.Take(), "factorization crop ");
}

TEST_F(SolveServiceTest, ATickWithNothingToDoLeavesTheHostAlone) {
  test.Analysed(ShakenTable(20, 40));
  test.state()->detailed = false;
  Solve();
  ASSERT_EQ(test.Call(HX_CMD_REFRESH_PARAMS), HX_ERR_NONE);
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  test.host.ForgetOperations();
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  for (const auto& operation : test.host.operations()) {
    const bool reads = operation.name == "checkout_param" || operation.name == "lock_handle" ||
                       operation.name.rfind("acquire ", 0) == 0;
    EXPECT_TRUE(reads) << operation.name;
  }
  EXPECT_EQ(test.host.Count("acquire HX Param Utils Suite 3"), 0);
  EXPECT_EQ(test.host.Count("acquire HX OV Private Effect Suite 3"), 0);
}

TEST_F(SolveServiceTest, ControlsFollowTheParameters) {
  test.Analysed(ShakenTable(20, 40));
  Solve();
  const auto refresh = [&] { ASSERT_EQ(test.Call(HX_CMD_REFRESH_PARAMS), HX_ERR_NONE); };
  refresh();
  for (const std::int32_t index : {5, 10, 11, 12, 18, 19})
    EXPECT_TRUE(test.Enabled(index)) << index;
  for (int index = 20; index <= 26; ++index) EXPECT_FALSE(test.Enabled(index)) << index;
  const std::string name = test.Name(kAutoScaleGroupIndex);
  EXPECT_EQ(name.substr(0, 12), "Auto-scale (");
  EXPECT_EQ(name.substr(name.size() - 2), "%)");
  EXPECT_NEAR(std::stod(name.substr(12)), 102, 1.5);  // a shake of some pixels in 640

  test.Set(kResultIndex, 2);
  test.Set(kMethodIndex, 2);
  test.Set(kFramingIndex, 4);
  refresh();
  for (const std::int32_t index : {5, 10, 11, 12, 18, 19}) {
    EXPECT_FALSE(test.Enabled(index)) << index;
  }
  for (int index = 20; index <= 26; ++index) EXPECT_TRUE(test.Enabled(index)) << index;
}

TEST_F(SolveServiceTest, AnotherSourceSizeIsReportedOnceAndNothingIsSolved) {
  test.Analysed(ShakenTable(20, 40));
  Solve();
  test.host.in.width = 1280;
  test.Set(kSmoothnessIndex, 10);
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  EXPECT_STREQ(test.host.out.return_msg,
               "Calmframe for layer \xE2\x80\x9C"
               "Clip 1\xE2\x80\x9D requires re-analysis because the source dimensions have "
               "changed from 640x360 to 1280x360.");
  ASSERT_EQ(test.Tick(), HX_ERR_NONE);
  EXPECT_FALSE(test.host.ShowsMessage());
  EXPECT_FALSE(test.state()->solver);
  EXPECT_EQ(stages.Take(), "");
  test.host.in.width = 640;
  test.TickUntilSolved();
  EXPECT_EQ(stages.Take(), "factorization crop ") << "it is the clip's own size again";
}

TEST_F(SolveServiceTest, WithoutItsSuiteASolveDoesNotStart) {
  StabilizerState& state = test.Analysed(ShakenTable(20, 40));
  test.host.RefuseSuite(HX_PRIVATE_EFFECT_SUITE);
  EXPECT_EQ(test.Tick(), HX_ERR_MISSING_SUITE);
  EXPECT_STREQ(test.host.out.return_msg, "Not able to acquire OVK Suite.");
  EXPECT_FALSE(state.solver);
  test.host.OfferAllSuites();
  test.TickUntilSolved();
  EXPECT_EQ(state.phase, SolvePhase::Solved);
}

// Whatever call fails, the host gets a code, and the solve is there in the end.
TEST_F(SolveServiceTest, AFailingCallAnywhereOnTheWay) {
  for (int n = 1; n < 400; ++n) {
    StabilizerState& state = test.Analysed(ShakenTable(8, 20));
    test.host.ForgetOperations();
    test.host.FailOperation(n);
    for (int tick = 0; tick < 4; ++tick) {
      const HX_Err code = test.Tick();
      EXPECT_TRUE(code == HX_ERR_NONE || code == FakeHost::kFault || code == HX_ERR_HANDLE_LOCK ||
                  code == HX_ERR_MISSING_SUITE)
          << n << ": " << code;
      if (state.solver) state.solver->Wait();
    }
    const bool all = test.host.operations().size() < static_cast<std::size_t>(n);
    test.host.FailOperation(0);
    test.TickUntilSolved();
    EXPECT_EQ(state.phase, SolvePhase::Solved) << n;
    EXPECT_EQ(test.Status(), 8) << n;
    test.Destroy();
    if (all) return;
  }
  FAIL() << "no end of host calls";
}

}  // namespace
}  // namespace kelp::effect
