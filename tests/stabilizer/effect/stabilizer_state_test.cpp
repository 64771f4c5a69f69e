#include "stabilizer/effect/src/stabilizer_state.h"

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <tuple>

#include "tests/support/parameter_values.h"
#include "tests/support/shifting_warper.h"

namespace kelp::effect {
namespace {

boost::shared_ptr<const cropper> Window(std::int32_t width, std::int32_t height) {
  const auto crop = boost::make_shared<cropper>(1, 1920, 1080);
  crop->cropWidth = width;
  crop->cropHeight = height;
  return crop;
}

// A state of a 1920 x 1080 clip with that crop window.
struct ZoomCase {
  ZoomCase(std::int32_t width, std::int32_t height, Framing framing) {
    values[kFramingIndex] = static_cast<int>(framing);
    analysis::Replace(state.solve_result, [&](SolveResult& next) {
      next.warper = ShiftingWarper(1920, 1080, {{0, 0}});
      next.crop = Window(width, height);
    });
  }
  double Zoom(bool auto_scale, bool additional) {
    Renderer renderer(state.solve_result->warper->unionBounds(), 1920, 1080, 64, 36, 1, 1);
    return state.GetZoom(values, renderer, auto_scale, additional);
  }
  bool OverCropped() { return state.IsOverCropped(values); }

  ParameterValues values;
  StabilizerState state{HX_InData{}, false};
};

TEST(StabilizerStateTest, ZoomIsOfTheScalesThatCount) {
  EXPECT_EQ(ZoomCase(960, 540, Framing::crop_auto_scale).Zoom(true, true), 1.5);  // Maximum Scale
  ZoomCase smaller(1700, 1000, Framing::crop);
  smaller.values[kAdditionalScaleIndex] = 50;
  EXPECT_EQ(smaller.Zoom(true, true), 0.5);
  EXPECT_EQ(smaller.Zoom(true, false), 1.0);
  EXPECT_EQ(smaller.Zoom(false, true), 0.5);
}

// By the window as it is shown, 1.5 times as large, if the framing crops.
TEST(StabilizerStateTest, OverCropped) {
  EXPECT_FALSE(ZoomCase(512, 288, Framing::crop_auto_scale).OverCropped());
  EXPECT_TRUE(ZoomCase(511, 288, Framing::crop_auto_scale).OverCropped());
  EXPECT_FALSE(ZoomCase(511, 288, Framing::stabilize_only).OverCropped());
}

TEST(StabilizerStateTest, MarginInFramesRoundsHalvesUp) {
  ParameterValues values;
  values[kFramingIndex] = static_cast<int>(Framing::synthesize_edges);
  EXPECT_EQ(MarginInFrames(values, 30), 15u);
  EXPECT_EQ(MarginInFrames(values, 25), 13u);
  EXPECT_EQ(MarginInFrames(values, 30000.0 / 1001), 15u);
  values[kSynthesisInputRangeIndex] = 0.01;
  EXPECT_EQ(MarginInFrames(values, 30), 0u);
  values[kSynthesisInputRangeIndex] = 999;
  EXPECT_EQ(MarginInFrames(values, 1e9), 2147483647u);
  values[kFramingIndex] = static_cast<int>(Framing::crop);
  EXPECT_EQ(MarginInFrames(values, 30), 0u);
}

// -- What a state shares with renders, and what a project keeps of it --

using tessel::utility::Guid;

// Makes it a solved state in which nothing is what a fresh state has.
void Fill(StabilizerState& state, std::int32_t first_frame) {
  state.source = {1440, 1080, 4, 3};
  analysis::Replace(state.result, [&](analysis::AnalysisResult& next) {
    next.job_input.FieldType = 2;
    next.source_identity = Guid::MakeUnique();
    next.tracker_identity = Guid::MakeUnique();
    next.all_features = {};
    next.all_features.feature_count = 1;
    next.all_features.frame_count = 1;
    next.all_features.first_frame = first_frame;
    next.all_features.features->resize(1);
  });
  state.solve_result = boost::make_shared<SolveResult>(
      SolveResult{ShiftingWarper(64, 36, {{0, 0}}), Window(9, 9), 77, 78});
  state.phase = SolvePhase::Solved;
  analysis::AnalyzerRecord job;
  job.tracker_guid = Guid::MakeUnique();
  state.analyzer = boost::make_shared<analysis::AnalyzerPrem>(job, Guid(), analysis::JobFactory());
  state.detailed = true;
  state.progress.start_tick = 1234;
}

auto SharedParts(const StabilizerState& state) {
  return std::tuple(state.source, state.result, state.solve_result, state.analyzer, state.phase,
                    state.needs_solve, state.subsequent_solve, state.first_analysis);
}

TEST(StabilizerStateTest, ARenderTakesOverAllThatWasPublished) {
  StabilizerSharedData block;
  StabilizerState own({}, false), render({}, true);
  Fill(own, 7);
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

TEST(StabilizerStateTest, AUserInterfaceInstanceKeepsItsTracksAndItsAnalyzer) {
  StabilizerSharedData block;
  StabilizerState own({}, false), other({}, false);
  Fill(own, 7);
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

TEST(StabilizerStateTest, WhatIsSavedIsLoaded) {
  StabilizerState own({}, false);
  Fill(own, 7);
  for (const bool has_job : {true, false}) {
    own.needs_solve = has_job;
    SavedState saved = own.Save();
    EXPECT_FALSE(saved.analysis_pending);
    saved.analysis_pending = true;
    StabilizerState loaded({}, false);
    loaded.Load(saved, {});
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
TEST(StabilizerStateTest, ResultsAreSavedAsFarAsTheyStand) {
  StabilizerState own({}, false);
  Fill(own, 7);
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
