#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "platform/tessel/debug.h"
#include "stabilizer/effect/src/stabilizer_effect.h"
#include "tests/support/hosted_effect.h"

// What projects keep of an effect. That another process goes on from there, and shows the same
// frames, is asked of the plug-in in tests/contract.
namespace calmframe::host {
namespace {

std::string BytesOf(const SavedEffect& saved) {
  return {saved.instance.begin(), saved.instance.end()};
}

SavedEffect WithBytes(SavedEffect saved, const std::string& bytes) {
  saved.instance.assign(bytes.begin(), bytes.end());
  return saved;
}

class StoredServiceTest : public ::testing::Test {
 protected:
  void Solve(int framing) {
    hosted.Apply();
    EXPECT_NE(hosted.RunsFor(kFraming, framing), "");
  }

  HostedEffect hosted{SmallClip(), {.saves_as = PayloadForm::raw}};
};

TEST_F(StoredServiceTest, ASolvedEffectComesBackBitForBitAndHasNothingToDo) {
  for (const auto& [framing, form] : {std::pair{2, PayloadForm::raw}, {4, PayloadForm::packed}}) {
    hosted.host().SaveAs(form);
    Solve(framing);
    const SavedEffect saved = hosted.Save();
    const std::vector<double> warp = hosted.Warp(3);
    hosted.Open(saved);
    EXPECT_EQ(hosted.Warp(3), warp);
    EXPECT_EQ(hosted.Runs(), "");
    const SavedEffect again = hosted.Save();
    EXPECT_TRUE(again.instance == saved.instance);
    EXPECT_EQ(again.values, saved.values) << "not even the counter";
    // A wider map needs tracks, and so does another path.
    const bool edges = framing == 4;
    EXPECT_EQ(hosted.RunsFor(edges ? kSynthesisInputRange : kSmoothness, edges ? 0.7 : 20),
              edges ? "factorization " : "factorization crop ");
    hosted.Remove();
  }
}

// And keeps what it had until the new results are there. A framing alone needs no more than the
// stored warps.
TEST_F(StoredServiceTest, SavedInTheMiddleOfASolveItSolves) {
  Solve(1);
  const struct {
    const char* held_at;
    std::int32_t index;
    double value;
    const char* runs;
  } cases[] = {{"Begin - RunCropper()", kFraming, 2, "crop "},
               {"Begin - RunFactorization()", kSmoothness, 10, "factorization crop "}};
  for (const auto& c : cases) {
    hosted.Reopen();
    const std::vector<double> warp = hosted.Warp(3);
    hosted.HoldSolve(c.held_at);
    hosted.Set(c.index, c.value);
    hosted.TickUntilHeld();
    {
      const std::jthread release = hosted.ReleaseSoon();  // a save waits for the solve to stop
      hosted.Reopen();
    }
    hosted.stages().Take();
    EXPECT_EQ(hosted.Warp(3), warp);
    EXPECT_EQ(hosted.Runs(), c.runs);
    EXPECT_EQ(hosted.Warp(3) == warp, c.index == kFraming);
  }
}

TEST(StoredCompressionTest, OptionsAndTheHostDecideWhetherItIsDeflated) {
  for (const PayloadForm form : {PayloadForm::deflated, PayloadForm::raw, PayloadForm::packed}) {
    HostedEffect hosted(SmallClip(), {.saves_as = form});
    ASSERT_EQ(hosted.Analyse(), 8);
    std::size_t sizes[2] = {};
    for (const auto& [always, never] : {std::pair{true, true}, {true, false}, {false, true}}) {
      tessel::debug::DebugDatabase::Set("AnalysisDataIsAlwaysCompressed", always);
      tessel::debug::DebugDatabase::Set("AnalysisDataIsNeverCompressed", never);
      const std::string bytes = BytesOf(hosted.Save());
      EXPECT_EQ(bytes[5], always ? 0 : 1);
      sizes[static_cast<int>(bytes[5])] = bytes.size();
    }
    EXPECT_LT(sizes[0], sizes[1] / 2);
    tessel::debug::DebugDatabase::Set("AnalysisDataIsNeverCompressed", false);
    EXPECT_EQ(BytesOf(hosted.Save())[5], static_cast<int>(form));
    EXPECT_FALSE(hosted.Warp(3).empty());
  }
}

TEST_F(StoredServiceTest, WhatCannotBeReadIsToldAndWaitsForAnalyze) {
  Solve(2);
  const SavedEffect saved = hosted.Save();
  std::string good = BytesOf(saved);
  // Flattened and raw, and no address.
  const std::uint64_t header[] = {0x10100000010, 0, good.size() - 31};
  EXPECT_EQ(std::memcmp(good.data(), header, sizeof header), 0);
  good.replace(8, 8, 8, '\xee');  // that of another process
  const auto with = [&good](std::size_t offset, int byte) {
    std::string bytes = good;
    bytes[offset] = static_cast<char>(byte);
    return bytes;
  };
  const std::size_t mesh = good.find("hseM");
  const std::string again = "Calmframe requires re-analysis because ";
  const std::string damaged = again + "saved data has been damaged.";
  const struct {
    std::string bytes;
    std::string message;
    int width = 96;
  } cases[] = {
      {with(4, 0), damaged},  // an address that is none of a state, as if the handle lived
      {with(4, 0).replace(8, 8, 8, '\0'), damaged},
      {with(0, 2), again + "the project data is from an old version."},
      {with(0, 17), again + "the project data is from a newer version."},
      {with(0, 12), damaged},  // whose payloads are deflated whatever the flag says
      {with(21, 1), damaged},  // 2^40 bytes
      {std::string(10, '\1'), damaged},
      {with(mesh, 'H'), damaged},
      {good.substr(0, good.size() - 40), damaged},
      {with(mesh + 4, good[mesh + 4] + 1),
       "Calmframe requires re-analysis because of an old project format."},
      {good,
       "Calmframe for layer \u201cClip 1\u201d requires re-analysis because the source dimensions "
       "have changed from 96x64 to 50x64.",
       50},
  };
  hosted.layer().Change([](LayerState& state) { state.name = "Clip 1"; });
  for (const auto& c : cases) {
    hosted.layer().Resize(c.width, 64);
    hosted.Open(WithBytes(saved, c.bytes));
    EXPECT_EQ(hosted.Messages(), std::vector<std::string>{c.message});
    EXPECT_EQ(hosted.Settle(), 1) << c.message;
    EXPECT_TRUE(hosted.Warp(3).empty());
    EXPECT_TRUE(hosted.Enabled(kAnalyze));
  }
  hosted.layer().Resize(96, 64);
  EXPECT_TRUE(hosted.Press(kAnalyze).ok());
  EXPECT_EQ(hosted.Settle(), 8);
}

// What an instance without a layer leaves: nothing to read, and no state until Analyze makes one.
TEST_F(StoredServiceTest, AnEmptyPayloadLeavesNoState) {
  Solve(3);
  const SavedEffect saved = hosted.Save();
  hosted.Open(WithBytes(saved, BytesOf(saved).replace(16, 8, 8, '\0').substr(0, 31)));
  EXPECT_TRUE(hosted.Messages().empty());
  EXPECT_TRUE(hosted.Tick().ok());
  hosted.Inside([](kelp::effect::StabilizerEffect& effect) {
    EXPECT_EQ(effect.GetState(), nullptr);
    EXPECT_EQ(effect.GetStatusForFrame(0), kelp::analysis::FrameStatus::PressAnalyze);
  });
  EXPECT_EQ(hosted.Save().instance.size(), 31u);
  EXPECT_TRUE(hosted.Press(kAnalyze).ok());
  EXPECT_EQ(hosted.Settle(), 8);
}

// An analysis that ran in another process is gone with it, and the host hears of it; what fits is
// not told again.
TEST_F(StoredServiceTest, TheCounterOfAProjectIsSetRight) {
  Solve(3);
  SavedEffect saved = hosted.Save();
  for (const auto& [told, status] : {std::pair{504.0, 8}, {506.0, 8}, {508.0, 8}}) {
    saved.values[Session::kStatusDiskId] = told;
    hosted.Open(saved);
    EXPECT_EQ(hosted.Status(), status);
    EXPECT_EQ(hosted.Value(kStatusCounter) > 600, told != 508) << told;
  }
  saved.values[Session::kStatusDiskId] = 504;
  hosted.Open(hosted.Altered(saved, [](kelp::effect::SavedState& state) {
    state.phase = kelp::effect::SolvePhase::Failed;
    KeepWarps(state, {});
  }));
  EXPECT_EQ(hosted.Status(), 10);
}

// Whatever fails in a save or the load behind it, the effect has what it had.
TEST_F(StoredServiceTest, AFailingSaveLosesNothing) {
  Solve(3);
  const std::vector<double> warp = hosted.Warp(3);
  const auto names = HostedEffect::OperationsOf([this] { hosted.Save(); });
  hosted.stages().Take();
  int failures = 0;
  for (std::size_t n = 1; n <= names.size(); ++n) {
    Operations::Get().FailNth(static_cast<std::int64_t>(n));
    SavedEffect saved;
    failures += !hosted.effect().Save(&saved).ok();
    Operations::Get().FailNone();
    EXPECT_TRUE(hosted.Tick().ok()) << names[n - 1];
    EXPECT_EQ(hosted.Warp(3), warp) << names[n - 1];
    EXPECT_EQ(hosted.Settle(), 8) << names[n - 1];
  }
  EXPECT_GT(failures, 10);
  EXPECT_EQ(hosted.stages().Take(), "");
}

}  // namespace
}  // namespace calmframe::host
