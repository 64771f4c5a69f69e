#include "analysis/src/validity.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>

#include "analysis/src/identities.h"
#include "analysis/src/read_job_input.h"
#include "analysis/src/state_errors.h"
#include "tests/analysis/src/fake_host.h"
#include "tests/analysis/src/fake_job.h"

namespace kelp::analysis {
namespace {

using tessel::utility::Guid;

// A state as an analysis of frames 10 to 29 left it, on a host where nothing has changed since.
class ValidityTest : public ::testing::Test {
 protected:
  ValidityTest() {
    host_.start = 10;
    host_.count = 20;
    host_.top = host_.AddPlainClip("0a000000-0000-0000-0000-000000000001");
    state_.job_input = ReadJobInput(&host_.in, &host_.out);
    state_.tracker_identity = GetIdentifierForTracker(selector_, {});
    state_.source_identity = GetUpstreamIdentifier(&host_.in, &host_.out);
    state_.all_features.frame_count = 20;
    state_.first_frame = 10;
  }

  bool Current() {
    PresentInputs present;
    present.job_input = [this] { return ReadJobInput(&host_.in, &host_.out); };
    present.tracker_identity = [this] { return GetIdentifierForTracker(selector_, {}); };
    present.source_identity = [this] { return GetUpstreamIdentifier(&host_.in, &host_.out); };
    return IsAnalysisCurrent(state_, present, &host_.out);
  }
  int Status(std::int64_t frame) {
    const JobInput input = ReadJobInput(&host_.in, &host_.out);
    return static_cast<int>(GetAnalysisStatus(state_, frame, &input));
  }

  FakeHost host_;
  AnalysisState state_;
  marrow::tracking::SelectorParams selector_;
};

TEST_F(ValidityTest, SpanFieldsParametersAndSourceCountAndThePathDoesNot) {
  EXPECT_TRUE(Current());
  state_.job_input.ProjectPath = u"/moved/since";
  EXPECT_TRUE(Current());
  const auto stale_with = [this](auto& place, auto value) {
    const auto before = std::exchange(place, value);
    EXPECT_FALSE(Current());
    place = before;
    EXPECT_TRUE(Current());
  };
  stale_with(host_.count, 19);
  stale_with(host_.start, 9);
  stale_with(host_.field, 1);
  stale_with(host_.ticks, 23543520);
  stale_with(selector_.spacing, 11);
  stale_with(host_.nodes[0].guid, "0a000000-0000-0000-0000-000000000002");
  stale_with(state_.source_identity, Guid());
  stale_with(state_.all_features.frame_count, 0);
  state_.tracker_identity = Guid();  // of an old project: not compared
  selector_.spacing = 11;
  EXPECT_TRUE(Current());
}

TEST_F(ValidityTest, AsksNothingForAnEmptyState) {
  const int before = host_.calls;
  state_.all_features.frame_count = 0;
  EXPECT_FALSE(Current());
  EXPECT_EQ(host_.calls, before);
}

TEST_F(ValidityTest, ASourceThatChangedBackWhileAskedStaysCurrent) {
  const Guid stored = state_.source_identity, other = Guid::MakeUnique();
  PresentInputs present;
  present.job_input = [this] { return state_.job_input; };
  present.tracker_identity = [this] { return state_.tracker_identity; };
  int asked = 0;
  present.source_identity = [&] { return ++asked == 1 ? other : stored; };
  EXPECT_TRUE(IsAnalysisCurrent(state_, present, &host_.out));
  EXPECT_EQ(state_.source_identity, other);
  asked = 0;
  present.source_identity = [&] { return ++asked, Guid::MakeUnique(); };
  EXPECT_FALSE(IsAnalysisCurrent(state_, present, &host_.out));
  EXPECT_EQ(asked, 2);
  EXPECT_EQ(state_.source_identity, other);
}

TEST_F(ValidityTest, WhatCannotBeLearntIsStaleWithoutAMessage) {
  host_.refusal = u"The layer is a still.";
  EXPECT_FALSE(Current());
  EXPECT_EQ(host_.out.out_flags, 0u);
  EXPECT_STREQ(host_.out.return_msg, "");
  host_.refusal.clear();
  host_.failing = {{"GetNodeGuid", 5}};
  EXPECT_FALSE(Current());
  host_.failing.clear();
  host_.missing = {"Rushbase Sequence Info Suite"};
  EXPECT_FALSE(Current());
  EXPECT_STREQ(host_.out.return_msg, "");
}

TEST_F(ValidityTest, StatusOfAFrame) {
  EXPECT_EQ(Status(10), 8);
  EXPECT_EQ(Status(29), 8);
  EXPECT_EQ(Status(9), 2);
  EXPECT_EQ(Status(30), 2);
  host_.start = 12;  // trimmed on both sides
  host_.count = 5;
  EXPECT_EQ(Status(14), 8);
  host_.start = 10;
  host_.count = 21;  // extended
  EXPECT_EQ(Status(14), 3);
  host_.start = 9;
  host_.count = 5;
  EXPECT_EQ(Status(10), 3);
  host_.start = 10;
  host_.count = 20;
  host_.field = 1;
  EXPECT_EQ(Status(14), 3);
  host_.field = 0;
  host_.ticks = 23543520;  // frames 10 to 20 of a shorter step lie within, but are others
  host_.start = 12;
  host_.count = 5;
  EXPECT_EQ(Status(14), 3);
  host_.ticks = 28224000;
  state_.job_input.FieldType = -1;
  EXPECT_EQ(Status(14), 3);
  state_.all_features.frame_count = 0;
  EXPECT_EQ(Status(14), 1);
  state_.analysis_pending = true;
  EXPECT_EQ(Status(14), 4);
  EXPECT_EQ(GetAnalysisStatus(state_, 14, nullptr), FrameStatus::GeneralFailure);
}

TEST_F(ValidityTest, ReadsTheLayersSpan) {
  const std::pair<std::int64_t, RationalTime> steps[] = {
      {23543520, {1001, 30000}}, {29429400, {1001, 24000}}, {28224000, {1, 25}}};
  for (const auto& [ticks, step] : steps) {
    host_.ticks = ticks;
    const JobInput input = ReadJobInput(&host_.in, &host_.out);
    EXPECT_TRUE(IdenticalTimes(input.StepTime, step)) << ticks;
    EXPECT_EQ(FloorSteps(input.StartTime, step), 10);
    EXPECT_EQ(FloorSteps(input.Duration, step), 20);
  }
  host_.start = -5;
  host_.field = 2;
  const JobInput input = ReadJobInput(&host_.in, &host_.out);
  EXPECT_EQ(input.StartTime.numerator, 0);
  EXPECT_EQ(input.FieldType, 2);
  EXPECT_TRUE(input.ProjectPath.empty() && input.SourceID.IsNil());

  host_.refusal = u"Zu gro\u00df.";
  try {
    ReadJobInput(&host_.in, &host_.out);
    ADD_FAILURE();
  } catch (std::int32_t code) {
    EXPECT_EQ(code, 514);
  }
  EXPECT_STREQ(host_.out.return_msg, "Zu gro\u00df.");
  EXPECT_EQ(host_.out.out_flags, 0x100u);
  host_.refusal.clear();
  host_.ticks = 0;
  EXPECT_THROW(ReadJobInput(&host_.in, &host_.out), std::int32_t);
}

TEST_F(ValidityTest, ASizeMismatchNamesLayerAndSizes) {
  constexpr char kText[] =
      "Calmframe for layer \u201cClip ^3\u201d requires re-analysis because the source dimensions "
      "have changed from 1920x1080 to 1280x720.";
  host_.layer_name = u"Clip ^3";
  ReportSizeMismatch(&host_.in, &host_.out, "Calmframe", {1920, 1080}, {1280, 720},
                     AfterReport::GoOn);
  EXPECT_STREQ(host_.out.return_msg, kText);
  EXPECT_EQ(host_.out.out_flags, 0x100u);
  host_.failing = {{"GetLayerName", 3}};
  EXPECT_THROW(
      ReportSizeMismatch(&host_.in, &host_.out, "Calmframe", {2, 1}, {1, 2}, AfterReport::Throw),
      StateDeserializationFailed);
  EXPECT_NE(std::strstr(host_.out.return_msg, "from 2x1 to 1x2."), nullptr);
}

}  // namespace
}  // namespace kelp::analysis
