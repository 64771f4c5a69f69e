#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <cstring>

#include "platform/tessel/debug.h"
#include "stabilizer/effect/src/instance_handle.h"
#include "tests/stabilizer/effect/stabilizer_host.h"

// Flattened and restored instances, through the plug-in's entry.
namespace kelp::effect {
namespace {

// A handle of the host's with these bytes, as the host-in's instance.
void Restore(StabilizerHost& test, const std::string& bytes) {
  HX_Handle handle = test.host.in.cb->new_handle(bytes.size());
  std::memcpy(test.host.in.cb->lock_handle(handle), bytes.data(), bytes.size());
  test.host.in.cb->unlock_handle(handle);
  test.host.in.instance_handle = handle;
  EXPECT_EQ(test.Call(HX_CMD_RESTORE_INSTANCE), HX_ERR_NONE);
}

// Little-endian: version, flags, slot, payload length, and 7 bytes that nobody uses.
std::string FlatHandle(std::uint32_t version, std::uint64_t length, const std::string& payload) {
  std::string bytes(24 + payload.size() + 7, '\0');
  std::memcpy(bytes.data(), &version, 4);
  bytes[4] = 1;
  std::memset(bytes.data() + 8, 0xee, 8);  // a pointer of another process
  std::memcpy(bytes.data() + 16, &length, 8);
  std::memcpy(bytes.data() + 24, payload.data(), payload.size());
  return bytes;
}

std::string Flatten(StabilizerHost& test) {
  EXPECT_EQ(test.Call(HX_CMD_FLATTEN_INSTANCE), HX_ERR_NONE);
  return test.host.handle_bytes(test.host.in.instance_handle);
}

std::string FlattenAndRestore(StabilizerHost& test) {
  std::string bytes = Flatten(test);
  EXPECT_EQ(test.Call(HX_CMD_RESTORE_INSTANCE), HX_ERR_NONE);
  return bytes;
}

// Solved by a Solver, with a crop.
StabilizerState& SolveFor(StabilizerHost& test, Framing framing = Framing::crop) {
  test.Set(kFramingIndex, static_cast<int>(framing));
  test.Analysed(ShakenTable(20, 40));
  test.TickUntilSolved();
  return *test.state();
}

TEST(StoredServiceTest, ASolvedInstanceComesBackBitForBit) {
  for (const Framing framing : {Framing::crop, Framing::synthesize_edges}) {
    StabilizerHost test;
    test.prefers_raw = true;
    const auto warper = SolveFor(test, framing).warper;
    const auto crop = test.state()->crop;
    EXPECT_EQ(crop != nullptr, framing == Framing::crop);
    const std::string bytes = FlattenAndRestore(test);
    StabilizerState& back = *test.state();
    ASSERT_TRUE(back.warper);
    EXPECT_NE(back.warper, warper);
    for (int f = 0; f < 20; ++f) {
      EXPECT_TRUE(back.warper->frameWarp(f)->values == warper->frameWarp(f)->values) << f;
    }
    EXPECT_EQ(back.warper->frameMap()->entries(), warper->frameMap()->entries());
    EXPECT_EQ(back.warper->frameMap()->entries().empty(), framing == Framing::crop);
    ASSERT_EQ(back.crop != nullptr, crop != nullptr);
    if (crop) {
      EXPECT_EQ(std::memcmp(back.crop->rects.data(), crop->rects.data(), 20 * sizeof(crop_rect)),
                0);
    }
    EXPECT_EQ(test.opaque_uses, 1);

    // Nothing is done again.
    for (int i = 0; i < 3; ++i) {
      EXPECT_EQ(test.Tick(), HX_ERR_NONE);
      EXPECT_FALSE(back.solver);
    }
    EXPECT_EQ(test.Effect().GetStatusForFrame(3), analysis::FrameStatus::Ready);
    EXPECT_TRUE(FlattenAndRestore(test) == bytes);

    // A wider map needs tracks, and so does another path.
    const bool edges = framing == Framing::synthesize_edges;
    test.Set(edges ? kSynthesisInputRangeIndex : kSmoothnessIndex, edges ? 0.7 : 20);
    EXPECT_EQ(test.Tick(), HX_ERR_NONE);
    ASSERT_TRUE(test.state()->solver);
    EXPECT_FALSE(test.state()->solver->warper_supplied());
    test.TickUntilSolved();
    EXPECT_EQ(test.state()->phase, SolvePhase::Solved);
  }
}

TEST(StoredServiceTest, AFramingAloneIsMadeFromTheStoredWarps) {
  StabilizerHost test;
  SolveFor(test, Framing::stabilize_only);
  FlattenAndRestore(test);
  test.Set(kFramingIndex, static_cast<int>(Framing::crop));
  EXPECT_EQ(test.Tick(), HX_ERR_NONE);
  ASSERT_TRUE(test.state()->solver);
  EXPECT_TRUE(test.state()->solver->warper_supplied());

  // Saved in the middle of it, it begins anew and keeps what it had.
  FlattenAndRestore(test);
  EXPECT_TRUE(test.state()->warper);
  EXPECT_FALSE(test.state()->crop);
  EXPECT_FALSE(test.state()->needs_solve);
  EXPECT_EQ(test.Tick(), HX_ERR_NONE);
  ASSERT_TRUE(test.state()->solver);
  EXPECT_TRUE(test.state()->solver->warper_supplied());
  test.TickUntilSolved();
  EXPECT_TRUE(test.state()->crop);
}

TEST(StoredServiceTest, SavedInTheMiddleOfASolveItSolves) {
  StabilizerHost test;
  test.Analysed(ShakenTable(20, 40));
  EXPECT_EQ(test.Tick(), HX_ERR_NONE);
  ASSERT_TRUE(test.state()->solver);
  FlattenAndRestore(test);
  EXPECT_FALSE(test.state()->solver);
  EXPECT_TRUE(test.state()->needs_solve);
  EXPECT_EQ(test.Effect().GetStatusForFrame(0), analysis::FrameStatus::SubsequentSolve);
  test.TickUntilSolved();
  EXPECT_EQ(test.Status(), 8);

  // A later one: what was solved stays until the new results are there.
  test.Set(kSmoothnessIndex, 10);
  EXPECT_EQ(test.Tick(), HX_ERR_NONE);
  ASSERT_TRUE(test.state()->solver);
  FlattenAndRestore(test);
  EXPECT_TRUE(test.state()->warper);
  EXPECT_EQ(test.Effect().GetStatusForFrame(0), analysis::FrameStatus::Ready);
  EXPECT_EQ(test.Tick(), HX_ERR_NONE);
  ASSERT_TRUE(test.state()->solver);
  EXPECT_FALSE(test.state()->solver->warper_supplied());
}

TEST(StoredServiceTest, AnAnalysisThatHasNotBegunBeginsAfterTheReload) {
  StabilizerHost test;
  ASSERT_EQ(test.Call(HX_CMD_CREATE_INSTANCE), HX_ERR_NONE);
  const analysis::AnalyzerRecord record = test.state()->analyzer->record();
  FlattenAndRestore(test);
  ASSERT_TRUE(test.state()->analyzer);
  EXPECT_EQ(test.state()->analyzer->job_stage(), analysis::JobStage::NotStarted);
  EXPECT_EQ(test.state()->analyzer->record().job_guid, record.job_guid);
  EXPECT_EQ(test.state()->analyzer->GetTrackerGuid(), record.tracker_guid);
  EXPECT_FALSE(test.state()->first_analysis);
  EXPECT_EQ(test.Effect().GetStatusForFrame(0), analysis::FrameStatus::AnalysisInProgress);

  // One whose job is not of this process is gone, and the host hears of it.
  test.state()->analyzer->set_job_stage(analysis::JobStage::SeenRunning);
  test.Set(kAnalysisStatusCounterIndex, 204);
  FlattenAndRestore(test);
  EXPECT_FALSE(test.state()->analyzer);
  EXPECT_EQ(test.Effect().GetStatusForFrame(0), analysis::FrameStatus::PressAnalyze);
  EXPECT_EQ(test.Tick(), HX_ERR_NONE);
  EXPECT_EQ(test.Status(), 1);
  EXPECT_TRUE(test.Enabled(kAnalyzeIndex));
}

TEST(StoredServiceTest, OptionsAndTheHostDecideWhetherItIsDeflated) {
  StabilizerHost test;
  SolveFor(test);
  const auto set = [](bool always, bool never) {
    tessel::debug::DebugDatabase::Set("AnalysisDataIsAlwaysCompressed", always);
    tessel::debug::DebugDatabase::Set("AnalysisDataIsNeverCompressed", never);
  };
  const struct {
    bool always, never, prefers_raw;
    char raw;
  } cases[] = {{false, false, false, 0},
               {false, false, true, 1},
               {false, true, false, 1},
               {true, true, true, 0},
               {true, false, true, 0}};
  std::size_t sizes[2] = {};
  for (const auto& c : cases) {
    set(c.always, c.never);
    test.prefers_raw = c.prefers_raw;
    const std::string bytes = FlattenAndRestore(test);
    EXPECT_EQ(bytes[5], c.raw);
    EXPECT_TRUE(test.state()->warper);
    sizes[static_cast<int>(c.raw)] = bytes.size();
  }
  set(false, false);
  EXPECT_LT(sizes[0], sizes[1] / 4);
}

TEST(StoredServiceTest, WhatCannotBeReadBecomesAnEmptyStateAndAMessage) {
  std::string good;
  {
    StabilizerHost test;
    test.prefers_raw = true;
    SolveFor(test);
    good = Flatten(test);
  }
  const std::size_t mesh = good.find("hseM");
  std::string bad_marker = good, other_grid = good, deflated_12 = good;
  bad_marker[mesh] = 'H';
  ++other_grid[mesh + 4];
  deflated_12[0] = 12;  // whose payloads are deflated whatever the flag says
  const std::string damaged = "Calmframe requires re-analysis because saved data has been damaged.";
  const struct {
    std::string bytes;
    std::string message;
    std::int32_t width = 640;
  } cases[] = {
      {FlatHandle(2, 0, ""),
       "Calmframe requires re-analysis because the project data is from an old version."},
      {FlatHandle(17, 0, ""),
       "Calmframe requires re-analysis because the project data is from a newer version."},
      {FlatHandle(16, 4, "????"), damaged},
      {FlatHandle(16, std::uint64_t{1} << 40, ""), damaged},
      {std::string(10, '\1'), damaged},
      {bad_marker, damaged},
      {deflated_12, damaged},
      {good.substr(0, good.size() - 40), damaged},
      {other_grid, "Calmframe requires re-analysis because of an old project format."},
      {good,
       "Calmframe for layer \u201cClip 1\u201d requires re-analysis because the source dimensions "
       "have changed from 640x360 to 320x360.",
       320},
  };
  for (const auto& c : cases) {
    StabilizerHost test;
    test.host.in.width = c.width;
    test.Set(kAnalysisStatusCounterIndex, 508);
    Restore(test, c.bytes);
    EXPECT_TRUE(test.host.ShowsMessage());
    EXPECT_EQ(std::string(test.host.out.return_msg), c.message);
    ASSERT_NE(test.state(), nullptr);
    EXPECT_FALSE(test.state()->warper);
    EXPECT_FALSE(test.state()->has_frames());
    EXPECT_EQ(test.Effect().GetStatusForFrame(0), analysis::FrameStatus::PressAnalyze);
    EXPECT_EQ(test.opaque_uses, 1);
    EXPECT_EQ(test.Tick(), HX_ERR_NONE);
    EXPECT_EQ(test.Status(), 1);
  }
}

// What an instance without a layer leaves: nothing to read, and no state until Analyze makes one.
TEST(StoredServiceTest, AnEmptyPayloadLeavesNoState) {
  StabilizerHost test;
  Restore(test, FlatHandle(16, 0, ""));
  EXPECT_EQ(test.state(), nullptr);
  EXPECT_FALSE(test.host.ShowsMessage());
  EXPECT_EQ(test.opaque_uses, 0);
  EXPECT_EQ(test.Tick(), HX_ERR_NONE);
  EXPECT_EQ(test.Effect().GetStatusForFrame(0), analysis::FrameStatus::PressAnalyze);
  EXPECT_EQ(test.Call(HX_CMD_REFRESH_PARAMS), HX_ERR_NONE);
  EXPECT_EQ(Flatten(test).size(), 31u);
  EXPECT_EQ(test.Call(HX_CMD_RESTORE_INSTANCE), HX_ERR_NONE);
  HX_ParamChangedExtra analyze{kAnalyzeIndex};
  EXPECT_EQ(test.Call(HX_CMD_PARAM_CHANGED, nullptr, &analyze), HX_ERR_NONE);
  ASSERT_NE(test.state(), nullptr);
  EXPECT_TRUE(test.state()->analyzer);
  EXPECT_EQ(test.opaque_uses, 1);
}

TEST(StoredServiceTest, ARestoreThatFailsKeepsTheBytes) {
  StabilizerHost test;
  SolveFor(test);
  const std::string bytes = Flatten(test);
  for (int n = 1;; ++n) {
    ASSERT_LT(n, 100) << "no end of host calls";
    test.host.FailOperation(n);
    const HX_Err code = test.Call(HX_CMD_RESTORE_INSTANCE);
    test.host.FailOperation(0);
    if (code == HX_ERR_NONE || test.state()) break;
    EXPECT_TRUE(test.host.handle_bytes(test.host.in.instance_handle) == bytes) << n;
  }
  ASSERT_TRUE(test.state());
  EXPECT_TRUE(test.state()->warper);
}

}  // namespace
}  // namespace kelp::effect
