#include "analysis/src/validity.h"

#include <gtest/gtest.h>

#include "analysis/src/identities.h"
#include "analysis/src/read_job_input.h"
#include "analysis/src/state_errors.h"
#include "tests/support/host_records.h"

namespace kelp::analysis {
namespace {

using calmframe::host::LayerState;
using calmframe::host::Operations;
using tessel::utility::Guid;

// A state as an analysis of frames 10 to 29 left it, on a host where nothing has changed since.
class ValidityTest : public calmframe::host::HostRecords {
 protected:
  ValidityTest() {
    hosted_.Place(10, 20);
    Stored([this](AnalysisResult& result) {
      result.job_input = Input();
      result.tracker_identity = GetIdentifierForTracker(selector_, {});
      result.source_identity = GetUpstreamIdentifier(&in_, &out_);
      result.all_features.frame_count = 20;
      result.all_features.first_frame = 10;
    });
  }

  // Changes what was analysed.
  template <class Change>
  void Stored(const Change& change) {
    Replace(state_.result, change);
  }
  JobInput Input() { return ReadJobInput(&in_, &out_); }
  Validity Found() {
    const PresentInputs present = {[this] { return Input(); },
                                   [this] { return GetIdentifierForTracker(selector_, {}); },
                                   [this] { return GetUpstreamIdentifier(&in_, &out_); }};
    return GetValidity(state_, present, &out_);
  }
  bool Current() { return Found() == Validity::Current; }
  int Status(std::int64_t frame) {
    const JobInput input = Input();
    return static_cast<int>(GetAnalysisStatus(state_, frame, &input));
  }

  AnalysisState state_;
  marrow::tracking::SelectorParams selector_;
};

TEST_F(ValidityTest, SpanFieldsParametersAndSourceCountAndThePathDoesNot) {
  EXPECT_TRUE(Current());
  Stored([](AnalysisResult& result) { result.job_input.ProjectPath = u"/moved/since"; });
  EXPECT_TRUE(Current());
  const LayerState before = *layer().state();
  const std::function<void(LayerState&)> changes[] = {
      [](LayerState& l) { l.length = 19; }, [](LayerState& l) { l.start_frame = 9; },
      [](LayerState& l) { l.field_type = 1; }, [](LayerState& l) { l.ticks_per_frame = 23543520; },
      [](LayerState& l) {
        l.effects.insert(l.effects.begin(), {1000000, "blur", "", {}});
      }};
  for (const auto& change : changes) {
    layer().Change(change);
    EXPECT_FALSE(Current());
    layer().Change([&](LayerState& l) { l = before; });
    EXPECT_TRUE(Current());
  }
  selector_.spacing = 11;
  EXPECT_EQ(Found(), Validity::Stale);
  layer().ReplaceMedia(calmframe::host::MakeShakyClip(calmframe::host::SmallClip("another")));
  EXPECT_EQ(Found(), Validity::OtherSource) << "whatever else has changed";
  layer().Change([&](LayerState& l) { l = before; });
  Stored([](AnalysisResult& result) { result.tracker_identity = {}; });  // of an old project
  EXPECT_TRUE(Current());
  media().faults.node_missing = true;
  EXPECT_EQ(Found(), Validity::Unknown);
  Stored([](AnalysisResult& result) { result.source_identity = {}; });
  EXPECT_FALSE(Current());
  Stored([](AnalysisResult& result) { result.all_features.frame_count = 0; });
  const auto asked = Operations::Get().count();
  EXPECT_EQ(GetValidity(state_, {[this] { return Input(); }, {}, {}}, &out_), Validity::Stale);
  EXPECT_EQ(Operations::Get().count(), asked) << "nothing is asked for it";
}

TEST_F(ValidityTest, ASourceThatChangedBackWhileAskedStaysCurrent) {
  const Guid stored = state_.result->source_identity, other = Guid::MakeUnique();
  int asked = 0;
  PresentInputs present = {[this] { return state_.result->job_input; },
                           [this] { return state_.result->tracker_identity; },
                           [&] { return ++asked == 1 ? other : stored; }};
  EXPECT_EQ(GetValidity(state_, present, &out_), Validity::Current);
  EXPECT_EQ(state_.result->source_identity, other);
  asked = 0;
  present.source_identity = [&] { return ++asked, Guid::MakeUnique(); };
  EXPECT_EQ(GetValidity(state_, present, &out_), Validity::OtherSource);
  EXPECT_EQ(asked, 2);
  EXPECT_EQ(state_.result->source_identity, other);
}

TEST_F(ValidityTest, WhatCannotBeLearntIsStaleWithoutAMessage) {
  for (const char* operation :
       {"Utility.GetStartFrame", "Video Segment.GetNodeGuid", "acquire Analysis Host Suite",
        "acquire Rushbase Sequence Info Suite"}) {
    Operations::Get().FailNth(1, operation);
    EXPECT_EQ(Found(), Validity::Unknown) << operation;
    EXPECT_EQ(TakeMessage(), "");
  }
  hosted_.Refuse("The layer is a still.");
  EXPECT_FALSE(Current());
  EXPECT_EQ(TakeMessage(), "");
}

TEST_F(ValidityTest, StatusOfAFrame) {
  const struct Span {
    std::int32_t start, count, field;
    std::int64_t ticks, frame;
    int status;
  } cases[] = {
      {10, 20, 0, 28224000, 10, 8}, {10, 20, 0, 28224000, 29, 8}, {10, 20, 0, 28224000, 9, 2},
      {10, 20, 0, 28224000, 30, 2}, {12, 5, 0, 28224000, 14, 8},  // trimmed on both sides
      {10, 21, 0, 28224000, 14, 3}, {9, 5, 0, 28224000, 10, 3},   // extended
      {10, 20, 1, 28224000, 14, 3}, {12, 5, 0, 23543520, 14, 3},  // within, but of a shorter step
  };
  for (const Span& c : cases) {
    layer().Change([&c](LayerState& layer) {
      layer.start_frame = c.start;
      layer.length = c.count;
      layer.field_type = c.field;
      layer.ticks_per_frame = c.ticks;
    });
    EXPECT_EQ(Status(c.frame), c.status) << c.start << " " << c.count << " " << c.frame;
  }
  layer().Change([](LayerState& layer) { layer.ticks_per_frame = 28224000; });
  EXPECT_EQ(Status(14), 8);
  state_.source_changed = true;
  EXPECT_EQ(Status(14), 3);
  state_.source_changed = false;
  Stored([](AnalysisResult& result) { result.job_input.FieldType = -1; });
  EXPECT_EQ(Status(14), 3);
  Stored([](AnalysisResult& result) { result.all_features.frame_count = 0; });
  EXPECT_EQ(Status(14), 1);
  state_.analysis_pending = true;
  EXPECT_EQ(Status(14), 4);
  EXPECT_EQ(GetAnalysisStatus(state_, 14, nullptr), FrameStatus::GeneralFailure);
}

TEST_F(ValidityTest, ReadsTheLayersSpan) {
  layer().Change([](LayerState& state) { state.ticks_per_frame = 29429400; });
  JobInput input = Input();
  EXPECT_TRUE(IdenticalTimes(input.StepTime, {1001, 24000}));
  EXPECT_EQ(FloorSteps(input.StartTime, input.StepTime), 10);
  EXPECT_EQ(FloorSteps(input.Duration, input.StepTime), 20);
  layer().Change([](LayerState& state) {
    state.start_frame = -5;
    state.field_type = 2;
  });
  input = Input();
  EXPECT_EQ(input.StartTime.numerator, 0);
  EXPECT_EQ(FloorSteps(input.Duration, input.StepTime), 15) << "of 20, from the media's first on";
  EXPECT_EQ(input.FieldType, 2);
  EXPECT_TRUE(input.ProjectPath.empty() && input.SourceID.IsNil());

  Changed<HX_UtilitySuite>(HX_UTILITY_SUITE_VERSION_3).GetTicksPerFrame =
      [](HX_EffectRef, std::int64_t* ticks) -> HX_Err { return *ticks = 0; };
  EXPECT_EQ(Thrown([this] { Input(); }), HX_ERR_UNKNOWN);
  hosted_.Refuse("Zu gro\u00df.");
  EXPECT_EQ(Thrown([this] { Input(); }), 514);
  EXPECT_EQ(TakeMessage(), "Zu gro\u00df.");
}

TEST_F(ValidityTest, ASizeMismatchNamesLayerAndSizes) {
  layer().Change([](LayerState& layer) { layer.name = "Clip ^3"; });
  ReportSizeMismatch(&in_, &out_, "Calmframe", {1920, 1080}, {1280, 720}, AfterReport::GoOn);
  EXPECT_EQ(TakeMessage(),
            "Calmframe for layer \u201cClip ^3\u201d requires re-analysis because the source "
            "dimensions have changed from 1920x1080 to 1280x720.");
  Operations::Get().FailNth(1, "Utility.GetLayerName");
  EXPECT_THROW(ReportSizeMismatch(&in_, &out_, "Calmframe", {2, 1}, {1, 2}, AfterReport::Throw),
               StateDeserializationFailed);
  EXPECT_NE(TakeMessage().find("from 2x1 to 1x2."), std::string::npos);
}

}  // namespace
}  // namespace kelp::analysis
