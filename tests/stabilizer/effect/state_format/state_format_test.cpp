#include <gtest/gtest.h>

#include <cmath>
#include <fstream>
#include <limits>
#include <sstream>

#include "analysis/src/identities.h"
#include "stabilizer/effect/src/state_format/state_reader.h"
#include "stabilizer/effect/src/state_format/state_writer.h"
#include "tests/stabilizer/effect/state_format/sample_payload.h"

namespace kelp::effect {
namespace {

using tessel::utility::Guid;

constexpr PresentSource kPresent{64, 36, 1, 1};

SavedState Read(const std::string& payload, std::uint32_t version, bool raw,
                const PresentSource& present = kPresent) {
  return ReadState(payload.data(), payload.size(), version, raw, present);
}

std::string Written(const SavedState& state) {
  tessel::filesupport::OStringByteStream out;
  WriteState(out, state);
  return out.Take();
}

StateRefused::Reason ReasonOf(const std::string& payload, std::uint32_t version, bool raw,
                              const PresentSource& present = kPresent) {
  try {
    Read(payload, version, raw, present);
  } catch (const StateRefused& refused) {
    return refused.reason;
  }
  ADD_FAILURE() << "loads";
  return {};
}

// The reader and the writer against a third hand: nothing that the format tells is lost or moved.
TEST(StateFormatTest, WhatIsReadIsWrittenAgainByteForByte) {
  for (const int phase : {2, 4, 0, 5}) {
    for (const bool has_job : {false, true}) {
      Sample sample;
      sample.phase = phase;
      sample.has_job = has_job;
      sample.has_crop = phase == 2;
      std::string payload = SamplePayload(sample);
      const SavedState state = Read(payload, 16, true);
      std::string written = Written(state);
      if (phase == 0 || phase == 5) {  // without results a solve is needed
        EXPECT_TRUE(state.needs_solve);
        EXPECT_EQ(Written(Read(written, 16, true)), written);
        continue;
      }
      EXPECT_FALSE(state.needs_solve);
      EXPECT_TRUE(written == payload) << phase << has_job;
      EXPECT_TRUE(Written(Read(Deflated(payload), 16, false)) == payload);
    }
  }
}

TEST(StateFormatTest, EachVersionTellsWhatItKnows) {
  for (std::uint32_t version = 3; version <= 16; ++version) {
    for (const int phase : {2, 4, 0}) {
      SCOPED_TRACE(testing::Message() << "version " << version << ", phase " << phase);
      Sample sample;
      sample.version = version;
      sample.phase = phase;
      const SavedState state = Read(Deflated(SamplePayload(sample)), version, false);

      const auto& table = state.all_features;
      EXPECT_EQ(table.frame_count, 2);
      EXPECT_EQ(table.feature_count, 3);
      EXPECT_EQ(table.first_frame, 7);
      ASSERT_EQ(table.features->size(), 6u);
      const auto& last = table.features->back();
      EXPECT_EQ(last.x, 10.15625f);
      EXPECT_EQ(last.y, -2.5f);
      EXPECT_EQ(last.status, -11);
      EXPECT_EQ(last.correlation, 0);
      EXPECT_EQ(state.job_input.StepTime.numerator, 1001);
      EXPECT_EQ(state.source_identity,
                version >= 5 ? Guid::FromText("50515253-5455-5657-5859-5a5b5c5d5e5f") : Guid());
      EXPECT_EQ(state.tracker_identity,
                version >= 14 ? Guid::FromText("30313233-3435-3637-3839-3a3b3c3d3e3f") : Guid());
      EXPECT_EQ(state.analysis_tick, version >= 8 ? kSampleTick : 0);
      EXPECT_EQ(bool(state.detailed), version >= 15);
      EXPECT_EQ(boost::logic::indeterminate(state.detailed), version < 15);
      EXPECT_EQ(state.source_width, 64);
      ASSERT_TRUE(state.job);
      EXPECT_EQ(state.job->selector_params.spacing, 11u);
      EXPECT_EQ(state.job->selector_params.threshold, 0.02f);
      EXPECT_EQ(state.job->job_stage, analysis::JobStage::SeenRunning);

      if (version < 7) {
        EXPECT_EQ(state.phase, SolvePhase::None);
        EXPECT_TRUE(state.needs_solve);
        continue;
      }
      EXPECT_EQ(static_cast<int>(state.phase), phase);
      EXPECT_EQ(state.solve_hash, 0x89abcdef);
      EXPECT_EQ(state.crop_hash, version < 16 && phase == 2 ? 0xffffffff : 0xfffffffe);
      EXPECT_EQ(state.needs_solve, phase == 0);
      EXPECT_EQ(state.warper != nullptr, phase == 2);
      EXPECT_EQ(state.crop != nullptr, version >= 16);
      if (state.warper) {
        EXPECT_FALSE(state.warper->driven());
        ASSERT_EQ(state.warper->frameWarpCount(), 2u);
        const auto vertex = state.warper->frameWarp(1)->vertex(2, 0);  // offsets (3 - 3, -2)
        EXPECT_NEAR(vertex.x, 1.25 + 2, 1e-12);
        EXPECT_NEAR(vertex.y, -0.5 - 2 / 256.0, 1e-12);
        ASSERT_EQ(state.warper->frameMap() != nullptr, version >= 10);
        if (state.warper->frameMap()) {
          marrow::stabilization::matrix3 motion;
          ASSERT_TRUE(state.warper->frameMap()->lookup(1, 0, motion));
          EXPECT_EQ(motion[2], 1.5);
          EXPECT_EQ(state.warper->frameMap()->radius(), 1);
        }
      }
      if (state.crop) {
        EXPECT_EQ(state.crop->maskWidth, 66u);
        EXPECT_EQ(state.crop->cropHeight, 30);
        EXPECT_EQ(state.crop->rects[1].left, 4);
        EXPECT_EQ(state.crop->rects[1].top, 2.5f);
        EXPECT_EQ(state.crop->rects[1].right, 53);
        EXPECT_EQ(state.crop->rects[1].bottom, 31.5f);
      }
    }
  }
}

TEST(StateFormatTest, RawIsAnswerableForFromVersion13) {
  for (std::uint32_t version = 10; version <= 16; ++version) {
    Sample sample;
    sample.version = version;
    const std::string plain = SamplePayload(sample), deflated = Deflated(plain);
    if (version < 13) {
      EXPECT_EQ(Read(deflated, version, true).all_features.frame_count, 2);
      EXPECT_EQ(ReasonOf(plain, version, true), StateRefused::Reason::Damaged);
    } else {
      EXPECT_EQ(Read(plain, version, true).all_features.frame_count, 2);
      EXPECT_EQ(ReasonOf(deflated, version, true), StateRefused::Reason::Damaged);
    }
  }
}

TEST(StateFormatTest, TimesAtALegacyScaleAreWhatTheyStoodFor) {
  Sample sample;
  sample.step_scale = "2398";
  const SavedState state = Read(SamplePayload(sample), 16, true);
  // 1001 / 2398 s are 10.0 frames of 1001 / 24000 s.
  EXPECT_EQ(state.job_input.StepTime.numerator, 10 * 1001);
  EXPECT_EQ(state.job_input.StepTime.denominator, 24000);
  EXPECT_EQ(state.job_input.Duration.numerator, 20 * 1001);
  EXPECT_EQ(state.job->job_input_parameters.StepTime.denominator, 24000);
  EXPECT_EQ(state.job_input.StartTime.denominator, 1);
}

TEST(StateFormatTest, AnotherSourceOrGridIsRefused) {
  const std::string payload = SamplePayload({});
  try {
    Read(payload, 16, true, {128, 72, 1, 1});
    FAIL();
  } catch (const StateRefused& refused) {
    EXPECT_EQ(refused.reason, StateRefused::Reason::SourceSize);
    EXPECT_EQ(refused.stored_width, 64);
    EXPECT_EQ(refused.stored_height, 36);
  }
  // Anamorphic pixels: the grid is that of 128 by 36.
  EXPECT_EQ(ReasonOf(payload, 16, true, {64, 36, 2, 1}), StateRefused::Reason::Grid);
  // Before sizes were stored the grid alone can tell.
  Sample old;
  old.version = 11;
  EXPECT_EQ(ReasonOf(Deflated(SamplePayload(old)), 11, false, {36, 64, 1, 1}),
            StateRefused::Reason::Grid);
  // Without a layer there is nothing to compare with.
  EXPECT_EQ(Read(payload, 16, true, {1, 1, 1, 1}).warper->frameWidth(), 64);
  Sample empty;
  empty.frames = empty.slots = 0;
  empty.phase = 0;
  empty.has_crop = false;
  EXPECT_EQ(Read(SamplePayload(empty), 16, true, {128, 72, 1, 1}).source_width, 128);
}

// Positions are 32nds of a pixel, halves away from zero; what dead cells hold may be anything.
TEST(StateFormatTest, PositionsAreRoundedAndDeadCellsAreHarmless) {
  SavedState state = Read(SamplePayload({}), 16, true);
  auto& cells = *state.all_features.features;
  const float nan = std::numeric_limits<float>::quiet_NaN();
  const float infinity = std::numeric_limits<float>::infinity();
  cells[0] = {1.0f + 1.0f / 64, -1.0f - 1.0f / 64, 1, 0.5f};
  cells[1] = {nan, infinity, -1, 0};
  cells[2] = {-1e30f, 2.01f, -4, 0};
  const std::string once = Written(state);
  const SavedState back = Read(once, 16, true);
  const auto& read = *back.all_features.features;
  EXPECT_EQ(read[0].x, 1.03125f);
  EXPECT_EQ(read[0].y, -1.03125f);
  EXPECT_EQ(read[0].correlation, 0);
  EXPECT_EQ(read[1].x, 0);
  EXPECT_EQ(read[1].y, 67108864.0f);
  EXPECT_EQ(read[2].x, -67108864.0f);
  EXPECT_EQ(read[2].y, 2.0f);
  EXPECT_EQ(read[2].status, -4);
  EXPECT_TRUE(Written(back) == once);
}

// Warps over curved grids with corners of any value come back bit for bit.
TEST(StateFormatTest, WarpsKeepTheirBits) {
  SavedState state = Read(SamplePayload({}), 16, true);
  const auto warper = boost::make_shared<marrow::stabilization::CPWarper>(2, 64, 36);
  for (int f = 0; f < 2; ++f) {
    const auto record = boost::make_shared<marrow::stabilization::VarVector>(64, 36);
    for (std::size_t i = 0; i < record->values.size(); ++i) {
      record->values[i] = std::sin(0.37 * static_cast<double>(i) + f) * 11 +
                          (i % 2 ? i / 128 : i / 2 % 64) * (1.01 + 1e-5 * f);
    }
    warper->storeFrameWarp(record, true);
  }
  state.warper = warper;
  const SavedState back = Read(Written(state), 16, true);
  for (int f = 0; f < 2; ++f) {
    EXPECT_TRUE(back.warper->frameWarp(f)->values == warper->frameWarp(f)->values);
  }
  EXPECT_EQ(back.warper->unionBounds().min_x, warper->unionBounds().min_x);
  EXPECT_EQ(back.warper->unionBounds().max_y, warper->unionBounds().max_y);
}

TEST(StateFormatTest, LaterKeysOfAJobMayBeMissing) {
  std::string job = SampleJob({});
  for (const auto& [from, until] : {std::pair{",\"eig_ratio_threshold\"", "}"},
                                    {",\"tolerance_primary_color_threshold\"", "}"},
                                    {",\"job_stage\"", "}"}}) {
    const std::size_t begin = job.find(from);
    job.erase(begin, job.find(until, begin) - begin);
  }
  const auto with_job = [](const std::string& text) {
    Sample sample;
    std::string payload = SamplePayload(sample);
    const std::string before = Bytes().Text(SampleJob(sample)).data();
    return payload.replace(payload.find(before), before.size(), Bytes().Text(text).data());
  };
  const SavedState state = Read(with_job(job), 16, true);
  EXPECT_EQ(state.job->job_stage, analysis::JobStage::NotStarted);
  EXPECT_EQ(state.job->selector_params.eig_ratio_threshold, 15.0f);
  EXPECT_EQ(state.job->tracker_guid, analysis::GetIdentifierForTracker(state.job->selector_params,
                                                                       state.job->tracker_params));
  // A wrapped one is one as well; others are damage.
  EXPECT_TRUE(Read(with_job("{\"SerializerWrappedObject\":" + job + "}"), 16, true).job);
  for (const char* const damage :
       {"", "{", "[]", "7", "{}", R"({"SerializerWrappedObject":7})", "\"job\""}) {
    EXPECT_EQ(ReasonOf(with_job(damage), 16, true), StateRefused::Reason::Damaged) << damage;
  }
  for (const auto& [from, to] : {std::pair{R"("scale":24000)", R"("scale":0)"},
                                 std::pair{R"("scale":24000)", R"("scale":-5)"},
                                 std::pair{R"("spacing":11)", R"("spacing":-1)"},
                                 std::pair{R"("max_eig":6000.0)", R"("max_eig":1e300)"},
                                 std::pair{R"("presmoothing":true)", R"("presmoothing":1)"},
                                 std::pair{R"("border":12,)", ""}}) {
    std::string changed = SampleJob({});
    changed.replace(changed.find(from), std::string(from).size(), to);
    EXPECT_EQ(ReasonOf(with_job(changed), 16, true), StateRefused::Reason::Damaged) << to;
  }
}

// The example of docs/state_format.md, as a reader of the page has it before them.
TEST(StateFormatTest, TheExampleOfThePageIsOne) {
  std::ifstream page(CALMFRAME_DOCS "/state_format.md");
  ASSERT_TRUE(page);
  // Offset, two spaces, at most 16 bytes in 47 columns.
  constexpr char kHex[] = "0123456789abcdef";
  std::string bytes;
  for (std::string line; std::getline(page, line);) {
    if (line.size() < 8 || line.find_first_not_of(kHex) != 4 || line.substr(4, 2) != "  ") continue;
    std::istringstream words(line.substr(6, 47));
    for (std::string word; words >> word;) {
      bytes += static_cast<char>(std::stoi(word, nullptr, 16));
    }
  }
  ASSERT_GT(bytes.size(), 24u);
  EXPECT_EQ(bytes.substr(0, 6), std::string("\x10\0\0\0\1\1", 6));
  std::uint64_t length = 0;
  std::memcpy(&length, bytes.data() + 16, 8);
  ASSERT_EQ(bytes.size(), 24 + length);
  const std::string payload = bytes.substr(24);
  const SavedState state = Read(payload, 16, true, {640, 360, 1, 1});
  EXPECT_EQ(state.all_features.frame_count, 1);
  EXPECT_EQ(state.all_features.features->at(1).x, 20.5f);
  EXPECT_EQ(state.phase, SolvePhase::Failed);
  EXPECT_EQ(state.job_input.StepTime.denominator, 25);
  EXPECT_TRUE(Written(state) == payload);
}

}  // namespace
}  // namespace kelp::effect
