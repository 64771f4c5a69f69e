#include "stabilizer/effect/src/stabilizer_state.h"

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <tuple>

#include "tests/support/shaken_table.h"
#include "tests/support/shifting_warper.h"

// What a state shares with renders, and what a project keeps of it.
namespace kelp::effect {
namespace {

using tessel::utility::Guid;

// Makes it a solved state in which nothing is what a fresh state has.
void Fill(StabilizerState& state, std::int32_t first_frame) {
  state.source = {1440, 1080, 4, 3};
  analysis::Replace(state.result, [&](analysis::AnalysisResult& next) {
    next.job_input.FieldType = 2;
    next.source_identity = Guid::MakeUnique();
    next.tracker_identity = Guid::MakeUnique();
    next.all_features = ShakenTable(1, 1);
    next.all_features.first_frame = first_frame;
  });
  state.solve_result = boost::make_shared<SolveResult>(SolveResult{
      ShiftingWarper(64, 36, {{0, 0}}), boost::make_shared<cropper>(1, 66, 38), 77, 78});
  state.phase = SolvePhase::Solved;
  analysis::AnalyzerRecord job;
  job.tracker_guid = Guid::MakeUnique();
  state.analyzer =
      boost::make_shared<analysis::AnalyzerPrem>(job, Guid(), nullptr, analysis::JobFactory());
  state.detailed = true;
  state.progress.start_tick = 1234;
}

class StabilizerStateTest : public ::testing::Test {
 protected:
  StabilizerStateTest() { Fill(own, 7); }

  StabilizerSharedData block;
  StabilizerState own{{}, false};
};

auto SharedParts(const StabilizerState& state) {
  return std::tuple(state.source, state.result, state.solve_result, state.analyzer, state.phase,
                    state.needs_solve, state.subsequent_solve, state.first_analysis);
}

TEST_F(StabilizerStateTest, ARenderTakesOverAllThatWasPublished) {
  StabilizerState render({}, true);
  own.shared = render.shared = &block;
  render.TakeOver();
  EXPECT_FALSE(render.has_frames()) << "nothing is published";
  for (const int flag : {0, 1, 2, 3}) {
    own.needs_solve = flag == 1;
    own.subsequent_solve = flag == 2;
    own.first_analysis = flag == 3;
    own.Publish(flag == 0);
    render.TakeOver();
    EXPECT_TRUE(SharedParts(render) == SharedParts(own)) << flag;
    EXPECT_EQ(block.contents.gpu_allowed, flag == 0);
  }
}

TEST_F(StabilizerStateTest, AUserInterfaceInstanceKeepsItsTracksAndItsAnalyzer) {
  StabilizerState other({}, false);
  Fill(other, 8);
  own.shared = other.shared = &block;
  other.Publish(false);
  const auto analyzer = own.analyzer;
  const auto cells = own.table().features;
  own.TakeOver();
  EXPECT_EQ(own.analyzer, analyzer);
  EXPECT_EQ(own.table().features, cells);
  EXPECT_EQ(own.table().first_frame, 7);
  EXPECT_EQ(own.result->source_identity, other.result->source_identity);
  EXPECT_EQ(own.result->tracker_identity, other.result->tracker_identity);
  EXPECT_EQ(own.solve_result, other.solve_result);
  EXPECT_EQ(other.table().first_frame, 8) << "what is published is never written";
}

TEST_F(StabilizerStateTest, WhatIsSavedIsLoaded) {
  for (const bool has_job : {true, false}) {
    own.needs_solve = has_job;
    SavedState saved = own.Save();
    EXPECT_FALSE(saved.analysis_pending);
    saved.analysis_pending = true;
    StabilizerState loaded({}, false);
    loaded.Load(saved, nullptr, {});
    ASSERT_EQ(loaded.analyzer != nullptr, has_job);
    EXPECT_EQ(loaded.analysis_pending, has_job) << "else frames would wait for nothing";
    if (has_job) {
      EXPECT_EQ(loaded.analyzer->record().tracker_guid, own.analyzer->record().tracker_guid);
      EXPECT_EQ(loaded.analyzer->GetSourceIdentity(), own.result->source_identity);
    }
    own.analyzer = loaded.analyzer;
    EXPECT_TRUE(SharedParts(loaded) == SharedParts(own));
    EXPECT_EQ(loaded.progress.start_tick, 1234u);
    EXPECT_TRUE(bool(loaded.detailed));
    EXPECT_FALSE(loaded.result_identity.IsNil());
    EXPECT_EQ(loaded.solve_input_identity, loaded.result_identity);
    own.analyzer.reset();
  }
}

// What does not fit is left out, or told to be of no parameters.
TEST_F(StabilizerStateTest, ResultsAreSavedAsFarAsTheyStand) {
  own.phase = SolvePhase::AnalysisFailed;
  auto saved = own.Save().solve_result;
  EXPECT_FALSE(saved->warper);
  EXPECT_FALSE(saved->crop);
  EXPECT_EQ(saved->solve_hash, 77);
  EXPECT_EQ(saved->crop_hash, 78);
  own.phase = SolvePhase::Solved;
  own.deletion_identity = Guid::MakeUnique();  // of others than the table is marked with
  saved = own.Save().solve_result;
  EXPECT_EQ(saved->warper, own.solve_result->warper);
  EXPECT_EQ(saved->solve_hash, std::int64_t{1} << 32);
  EXPECT_EQ(saved->crop_hash, 78);
  EXPECT_EQ(own.solve_result->solve_hash, 77);
}

}  // namespace
}  // namespace kelp::effect
