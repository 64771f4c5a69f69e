#include <gtest/gtest.h>

#include <chrono>
#include <string>
#include <vector>

#include "stabilizer/effect/src/stabilizer_effect.h"
#include "tests/support/hosted_effect.h"
#include "tests/support/shifting_warper.h"

// What a change calls for, while a solve works and when one has failed. That the way through a
// first solve ends well, and what fails on it, is asked of the plug-in in tests/contract.
namespace calmframe::host {
namespace {

using namespace std::chrono_literals;
using kelp::effect::ShiftingWarper;
using kelp::effect::StabilizerEffect;
using kelp::effect::StabilizerState;

class SolveServiceTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(hosted.Analyse(), 8);
    hosted.stages().Take();
  }
  // Statuses that the host was told.
  int Told() const { return static_cast<int>(hosted.Value(kStatusCounter)) / 100; }

  HostedEffect hosted{SmallClip()};
};

TEST_F(SolveServiceTest, HashesDecideWhatAChangeCallsFor) {
  EXPECT_EQ(hosted.Info().first, "Stabilization finished:");
  const std::string crop = "crop ", all = "factorization crop ";
  const struct {
    std::int32_t index;
    double value;
    std::string runs;
  } changes[] = {{kAdditionalScale, 1, ""},  {kHideBanner, 1, ""},   {kSynthesisLeft, 1, ""},
                 {kFraming, 1, ""},          {kFraming, 3, ""},  // nothing has changed since
                 {kMaximumScale, 120, crop}, {kSmoothness, 10, all}, {kMethod, 1, all},
                 {kResult, 2, all}};
  for (const auto& c : changes) {
    const std::vector<double> before = hosted.Warp(3);
    EXPECT_EQ(hosted.RunsFor(c.index, c.value), c.runs) << c.index;
    EXPECT_EQ(hosted.Warp(3) != before, c.runs == all) << c.index;
  }
  EXPECT_EQ(hosted.Info().first, "") << "a later solve clears the panel";
}

TEST_F(SolveServiceTest, EdgeSynthesisWantsAFrameMapThatIsWideEnough) {
  const auto radius = [this] {
    std::uint32_t frames = 0;
    hosted.Inside([&](StabilizerEffect& effect) { frames = effect.GetState()->FrameMapRadius(); });
    return frames;
  };
  const std::vector<double> warp = hosted.Warp(3);
  EXPECT_EQ(hosted.RunsFor(kSynthesisInputRange, 0.12), "");
  EXPECT_EQ(hosted.RunsFor(kFraming, 4), "") << "no crop either";
  EXPECT_EQ(radius(), 3u);  // frames in 0.12 seconds at 25
  const int told = Told();
  EXPECT_EQ(hosted.RunsFor(kSynthesisInputRange, 0.05), "");
  EXPECT_EQ(radius(), 3u) << "the map at hand will do";
  EXPECT_EQ(Told(), told);
  EXPECT_EQ(hosted.RunsFor(kSynthesisInputRange, 0.2), "");
  EXPECT_EQ(radius(), 5u);
  EXPECT_GT(Told(), told);
  EXPECT_EQ(hosted.RunsFor(kFraming, 3), "crop ");
  EXPECT_EQ(radius(), 0u);
  EXPECT_EQ(hosted.Warp(3), warp);
}

// Each by one of the things that the warps were made from.
TEST_F(SolveServiceTest, WarpsOfAnotherAnalysisAreNotReused) {
  const auto run = [this](const std::function<void(StabilizerState&)>& change) {
    hosted.Inside([&](StabilizerEffect& effect) {
      change(*effect.GetState());
      effect.MarkNeedsSolve();
    });
    return hosted.Runs();
  };
  const auto keep = [](int width, int height, std::size_t frames) {
    const std::vector<marrow::stabilization::point2> shifts(frames);
    return [=](StabilizerState& state) { KeepWarps(state, ShiftingWarper(width, height, shifts)); };
  };
  EXPECT_EQ(run([](StabilizerState&) {}), "crop ");
  const struct {
    const char* name;
    std::function<void(StabilizerState&)> change;
  } cases[] = {
      {"none", [](StabilizerState& state) { KeepWarps(state, {}); }},
      {"new tracks", [](StabilizerState& state) { state.MakeResultIdentityUnique(); }},
      {"a start that failed",
       [](StabilizerState& state) { state.phase = kelp::effect::SolvePhase::AnalysisFailed; }},
      {"a frame less", keep(96, 64, 7)},
      {"another width", keep(95, 64, 8)},
      {"another height", keep(96, 63, 8)}};
  for (const auto& c : cases) {
    EXPECT_EQ(run(c.change), "factorization crop ") << c.name;
    EXPECT_EQ(run([](StabilizerState&) {}), "crop ") << c.name;
  }
}

TEST_F(SolveServiceTest, AFailedFramingLeavesNoWarpsToGoOnWith) {
  hosted.stages().FailAt("Begin - RunCropper()");
  hosted.Set(kMaximumScale, 120);
  EXPECT_EQ(hosted.Settle(), 10);
  EXPECT_TRUE(hosted.Warp(3).empty());
  hosted.stages().FailAt("");
  hosted.stages().Take();
  EXPECT_EQ(hosted.Settle(), 10);
  EXPECT_EQ(hosted.stages().Take(), "") << "it isn't tried again by itself";
  EXPECT_EQ(hosted.RunsFor(kMaximumScale, 200), "factorization crop ");
}

TEST_F(SolveServiceTest, ASolveAtWorkIsKeptAndShowsThatItLives) {
  EXPECT_EQ(hosted.Name(kGroup), "Stabilization");
  hosted.HoldSolve();
  hosted.Set(kSmoothness, 30);
  hosted.TickUntilHeld();
  EXPECT_EQ(hosted.Status(), 6);
  const int told = Told();
  {
    const std::jthread release = hosted.ReleaseSoon();
    EXPECT_TRUE(hosted.Tick().ok());
  }
  if (hosted.Status() == 6) {
    EXPECT_EQ(hosted.Name(kGroup).size(), 16u) << "dots";
  }
  EXPECT_EQ(hosted.Settle(), 8);
  EXPECT_EQ(Told(), told + 1) << "its end alone";
  EXPECT_EQ(hosted.Name(kGroup), "Stabilization");
}

TEST_F(SolveServiceTest, AnAnalysisThatEndsASolveTakesItsDotsAway) {
  hosted.HoldSolve();
  hosted.Set(kSmoothness, 30);
  hosted.TickUntilHeld();
  hosted.Tick();
  EXPECT_EQ(hosted.Name(kGroup).size(), 16u);
  const std::jthread release = hosted.ReleaseSoon();
  hosted.Set(kDetailedAnalysis, 1);
  EXPECT_EQ(hosted.Status(), 4);
  EXPECT_EQ(hosted.Name(kGroup), "Stabilization");
}

// Whoever waits for the host's wake need not look by himself.
TEST_F(SolveServiceTest, ASolveThatEndsBringsTheHostBack) {
  hosted.HoldSolve("End - RunCropper()");
  hosted.Set(kSmoothness, 30);
  hosted.TickUntilHeld();
  while (hosted.host().wake()->Wait(0ms)) continue;
  const std::uint64_t generation = hosted.Generation();
  hosted.Release();
  EXPECT_TRUE(hosted.host().wake()->Wait(1min));
  EXPECT_GT(hosted.Generation(), generation);
  EXPECT_EQ(hosted.Status(), 6) << "the rest is for a tick";
  EXPECT_EQ(hosted.Settle(), 8);
}

TEST_F(SolveServiceTest, ControlsFollowTheParameters) {
  const std::string name = hosted.Name(kAutoScale);
  EXPECT_EQ(name.substr(0, 12), "Auto-scale (");
  EXPECT_EQ(name.substr(name.size() - 2), "%)");
  EXPECT_NEAR(std::stod(name.substr(12)), 110, 12);  // a shake of some pixels in 96
  hosted.Set(kAdditionalScale, 50);
  EXPECT_EQ(hosted.Name(kAutoScale), name) << "the window's alone";
  hosted.RunsFor(kMaximumScale, 102);
  EXPECT_EQ(hosted.Name(kAutoScale), "Auto-scale (102.0%)");

  const std::vector<std::int32_t> scales = {kAutoScale, kMaximumScale, kActionSafeMargin};
  const struct {
    int result, method, framing;
    bool smoothness, crop_path, auto_scale, ripple, synthesis;
  } cases[] = {
      {1, 4, 3, true, true, true, true, false},   {2, 4, 3, false, false, true, true, false},
      {1, 3, 3, true, true, true, true, false},   {1, 2, 3, true, true, true, false, false},
      {1, 1, 2, true, true, false, false, false}, {1, 4, 1, true, false, false, true, false},
      {2, 3, 4, false, false, false, true, true}};
  for (const auto& c : cases) {
    SCOPED_TRACE(testing::Message() << c.result << c.method << c.framing);
    hosted.Set(kResult, c.result);
    hosted.Set(kMethod, c.method);
    hosted.Set(kFraming, c.framing);
    EXPECT_EQ(hosted.Enabled(kSmoothness), c.smoothness);
    EXPECT_EQ(hosted.Enabled(kCropLessSmoothMore), c.crop_path);
    EXPECT_EQ(hosted.Enabled(kRollingShutterRipple), c.ripple);
    for (const std::int32_t index : scales) EXPECT_EQ(hosted.Enabled(index), c.auto_scale) << index;
    for (std::int32_t index = kSynthesisInputRange; index <= kSynthesisBottom; ++index) {
      EXPECT_EQ(hosted.Enabled(index), c.synthesis) << index;
    }
  }
}

TEST_F(SolveServiceTest, AtAnotherSizeNothingIsSolvedUntilItIsTheOldOne) {
  EXPECT_TRUE(hosted.Set(kSmoothness, 10).ok());  // which the next tick would solve
  hosted.layer().Resize(48, 64);
  const int told = Told();
  for (int i = 0; i < 3; ++i) EXPECT_TRUE(hosted.Tick().ok());
  EXPECT_EQ(Told(), told + 1) << "that it is another source";
  EXPECT_EQ(hosted.stages().Take(), "");
  EXPECT_EQ(hosted.Messages().size(), 1u);
  hosted.layer().Resize(96, 64);
  EXPECT_EQ(hosted.Runs(), "factorization crop ");
}

}  // namespace
}  // namespace calmframe::host
