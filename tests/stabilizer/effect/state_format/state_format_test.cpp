#include <gtest/gtest.h>

#include <cmath>
#include <fstream>
#include <limits>
#include <sstream>

#include "analysis/src/identities.h"
#include "stabilizer/effect/src/state_format/state_reader.h"
#include "stabilizer/effect/src/state_format/state_writer.h"
#include "tests/stabilizer/effect/state_format/samples.h"

namespace kelp::effect {
namespace {

using tessel::utility::Guid;

constexpr SourceShape kPresent{64, 36, 1, 1};
constexpr std::int64_t kSolveHash = 0x89abcdef, kCropHash = 0xfffffffe;

SavedState Read(const std::string& payload, std::uint32_t version, bool raw,
                const SourceShape& present = kPresent) {
  return ReadState(payload.data(), payload.size(), version, raw, present);
}

SavedState Read(const char* sample, const SourceShape& present = kPresent) {
  const auto& [version, deflated, plain] = ReadSample(sample);
  return Read(deflated, version, false, present);
}

std::string Written(const SavedState& state) {
  tessel::filesupport::OStringByteStream out;
  WriteState(out, state);
  return out.Take();
}

StateRefused::Reason ReasonOf(const std::string& payload, std::uint32_t version, bool raw,
                              const SourceShape& present = kPresent) {
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
  for (const char* const name :
       {"v16_solved", "v16_solved_no_job", "v16_failed_no_crop", "v16_failed_no_crop_no_job"}) {
    const auto& [version, deflated, plain] = ReadSample(name);
    EXPECT_TRUE(Written(Read(plain, version, true)) == plain) << name;
    EXPECT_TRUE(Written(Read(deflated, version, false)) == plain) << name;
  }
  // Without results a solve is needed.
  for (const char* const name : {"v16_unsolved", "v16_analysis_failed_no_crop", "v16_empty"}) {
    const SavedState state = Read(name);
    EXPECT_TRUE(state.needs_solve);
    EXPECT_EQ(Written(Read(Written(state), 16, true)), Written(state));
  }
}

TEST(StateFormatTest, EachVersionTellsWhatItKnows) {
  for (std::uint32_t version = 3; version <= 16; ++version) {
    for (const auto& [phase, name] : {std::pair{2, "solved"}, {4, "failed"}, {0, "unsolved"}}) {
      SCOPED_TRACE(testing::Message() << "version " << version << ", " << name);
      const SavedState state = Read(ReadSample(version, name).deflated, version, false);
      const auto& [job_input, source_identity, tracker_identity, table] = *state.result;
      const auto& [warper, crop, solve_hash, crop_hash] = *state.solve_result;
      EXPECT_EQ(table.frame_count, 2);
      EXPECT_EQ(table.feature_count, 3);
      EXPECT_EQ(table.first_frame, 7);
      ASSERT_EQ(table.features->size(), 6u);
      const auto& last = table.features->back();
      EXPECT_EQ(last.x, 10.15625f);
      EXPECT_EQ(last.y, -2.5f);
      EXPECT_EQ(last.status, -11);
      EXPECT_EQ(last.correlation, 0);
      EXPECT_EQ(job_input.StepTime.numerator, 1001);
      EXPECT_EQ(source_identity,
                version >= 5 ? Guid::FromText("50515253-5455-5657-5859-5a5b5c5d5e5f") : Guid());
      EXPECT_EQ(tracker_identity,
                version >= 14 ? Guid::FromText("30313233-3435-3637-3839-3a3b3c3d3e3f") : Guid());
      EXPECT_EQ(state.analysis_tick, version >= 8 ? 0x0102030405060708u : 0);
      EXPECT_EQ(bool(state.detailed), version >= 15);
      EXPECT_EQ(boost::logic::indeterminate(state.detailed), version < 15);
      EXPECT_EQ(state.source.width, 64);
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
      EXPECT_EQ(solve_hash, kSolveHash);
      EXPECT_EQ(crop_hash, version < 16 && phase == 2 ? kCropHash + 1 : kCropHash);
      EXPECT_EQ(state.needs_solve, phase == 0);
      EXPECT_EQ(warper != nullptr, phase == 2);
      EXPECT_EQ(crop != nullptr, version >= 16);
      if (warper) {
        EXPECT_FALSE(warper->driven());
        ASSERT_EQ(warper->frameWarpCount(), 2u);
        const auto vertex = warper->frameWarp(1)->vertex(2, 0);  // offsets (3 - 3, -2)
        EXPECT_NEAR(vertex.x, 1.25 + 2, 1e-12);
        EXPECT_NEAR(vertex.y, -0.5 - 2 / 256.0, 1e-12);
        ASSERT_EQ(warper->frameMap() != nullptr, version >= 10);
        if (warper->frameMap()) {
          marrow::stabilization::matrix3 motion;
          ASSERT_TRUE(warper->frameMap()->lookup(1, 0, motion));
          EXPECT_EQ(motion[2], 1.5);
          EXPECT_EQ(warper->frameMap()->radius(), 1);
        }
      }
      if (crop) {
        EXPECT_EQ(crop->maskWidth, 66u);
        EXPECT_EQ(crop->cropHeight, 30);
        EXPECT_EQ(crop->rects[1].left, 4);
        EXPECT_EQ(crop->rects[1].top, 2.5f);
        EXPECT_EQ(crop->rects[1].right, 53);
        EXPECT_EQ(crop->rects[1].bottom, 31.5f);
      }
    }
  }
}

TEST(StateFormatTest, RawIsAnswerableForFromVersion13) {
  for (std::uint32_t version = 10; version <= 16; ++version) {
    const auto& [same, deflated, plain] = ReadSample(version, "solved");
    if (version < 13) {
      EXPECT_EQ(Read(deflated, version, true).result->all_features.frame_count, 2);
      EXPECT_EQ(ReasonOf(plain, version, true), StateRefused::Reason::Damaged);
    } else {
      EXPECT_EQ(Read(plain, version, true).result->all_features.frame_count, 2);
      EXPECT_EQ(ReasonOf(deflated, version, true), StateRefused::Reason::Damaged);
    }
  }
}

TEST(StateFormatTest, TimesAtALegacyScaleAreWhatTheyStoodFor) {
  const SavedState state = Read("v16_legacy_times");
  const analysis::JobInput& input = state.result->job_input;
  // 1001 / 2398 s are 10.0 frames of 1001 / 24000 s.
  EXPECT_EQ(input.StepTime.numerator, 10 * 1001);
  EXPECT_EQ(input.StepTime.denominator, 24000);
  EXPECT_EQ(input.Duration.numerator, 20 * 1001);
  EXPECT_EQ(state.job->job_input_parameters.StepTime.denominator, 24000);
  EXPECT_EQ(input.StartTime.denominator, 1);
}

TEST(StateFormatTest, AnotherSourceOrGridIsRefused) {
  const std::string payload = ReadSample("v16_solved").plain;
  try {
    Read(payload, 16, true, {128, 72, 1, 1});
    FAIL();
  } catch (const StateRefused& refused) {
    EXPECT_EQ(refused.reason, StateRefused::Reason::SourceSize);
    EXPECT_EQ(refused.stored.width, 64);
    EXPECT_EQ(refused.stored.height, 36);
  }
  // Anamorphic pixels: the grid is that of 128 by 36.
  EXPECT_EQ(ReasonOf(payload, 16, true, {64, 36, 2, 1}), StateRefused::Reason::Grid);
  // Before sizes were stored the grid alone can tell.
  EXPECT_EQ(ReasonOf(ReadSample("v11_solved").deflated, 11, false, {36, 64, 1, 1}),
            StateRefused::Reason::Grid);
  // Without a layer there is nothing to compare with.
  EXPECT_EQ(Read("v16_solved", {1, 1, 1, 1}).solve_result->warper->frameWidth(), 64);
  EXPECT_EQ(Read("v16_empty", {128, 72, 1, 1}).source.width, 128);
}

// Positions are 32nds of a pixel, halves away from zero; what dead cells hold may be anything.
TEST(StateFormatTest, PositionsAreRoundedAndDeadCellsAreHarmless) {
  const SavedState state = Read("v16_solved");
  auto& cells = *state.result->all_features.features;
  const float nan = std::numeric_limits<float>::quiet_NaN();
  const float infinity = std::numeric_limits<float>::infinity();
  cells[0] = {1.0f + 1.0f / 64, -1.0f - 1.0f / 64, 1, 0.5f};
  cells[1] = {nan, infinity, -1, 0};
  cells[2] = {-1e30f, 2.01f, -4, 0};
  const std::string once = Written(state);
  const SavedState back = Read(once, 16, true);
  const auto& read = *back.result->all_features.features;
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
  SavedState state = Read("v16_solved");
  const auto warper = boost::make_shared<marrow::stabilization::CPWarper>(2, 64, 36);
  for (int f = 0; f < 2; ++f) {
    const auto record = boost::make_shared<marrow::stabilization::VarVector>(64, 36);
    for (std::size_t i = 0; i < record->values.size(); ++i) {
      record->values[i] = std::sin(0.37 * static_cast<double>(i) + f) * 11 +
                          (i % 2 ? i / 128 : i / 2 % 64) * (1.01 + 1e-5 * f);
    }
    warper->storeFrameWarp(record, true);
  }
  analysis::Replace(state.solve_result, [&](SolveResult& next) { next.warper = warper; });
  const auto back = Read(Written(state), 16, true).solve_result->warper;
  for (int f = 0; f < 2; ++f) {
    EXPECT_TRUE(back->frameWarp(f)->values == warper->frameWarp(f)->values);
  }
  EXPECT_EQ(back->unionBounds().min_x, warper->unionBounds().min_x);
  EXPECT_EQ(back->unionBounds().max_y, warper->unionBounds().max_y);
}

// The solved sample, with what `change` makes of its job's text.
template <class Change>
std::string WithJob(const Change& change) {
  const auto units = [](const std::string& ascii) {
    std::string bytes;
    for (const char c : ascii) bytes += {c, '\0'};
    return bytes;
  };
  std::string payload = ReadSample("v16_solved").plain;
  const std::size_t begin = payload.find(units("{\"job_guid\""));
  std::uint32_t length = 0;
  std::memcpy(&length, payload.data() + begin - 4, 4);
  std::string job;
  for (std::size_t i = 0; i < length; ++i) job += payload[begin + 2 * i];
  change(job);
  return payload.replace(begin - 4, 4 + 2 * length,
                         BytesOf(static_cast<std::uint32_t>(job.size())) + units(job));
}

TEST(StateFormatTest, LaterKeysOfAJobMayBeMissing) {
  const auto without_later_keys = [](std::string& job) {
    for (const char* const key :
         {",\"eig_ratio_threshold\"", ",\"tolerance_primary_color_threshold\"", ",\"job_stage\""}) {
      const std::size_t begin = job.find(key);
      job.erase(begin, job.find('}', begin) - begin);
    }
  };
  const SavedState state = Read(WithJob(without_later_keys), 16, true);
  EXPECT_EQ(state.job->job_stage, analysis::JobStage::NotStarted);
  EXPECT_EQ(state.job->selector_params.eig_ratio_threshold, 15.0f);
  EXPECT_EQ(state.job->tracker_guid, analysis::GetIdentifierForTracker(state.job->selector_params,
                                                                       state.job->tracker_params));
}

TEST(StateFormatTest, AJobThatIsNoneIsDamage) {
  // A wrapped one is one as well.
  const auto wrap = [](std::string& job) { job = "{\"SerializerWrappedObject\":" + job + "}"; };
  EXPECT_TRUE(Read(WithJob(wrap), 16, true).job);
  for (const char* const damage :
       {"", "{", "[]", "7", "{}", R"({"SerializerWrappedObject":7})", "\"job\""}) {
    EXPECT_EQ(ReasonOf(WithJob([damage](std::string& job) { job = damage; }), 16, true),
              StateRefused::Reason::Damaged)
        << damage;
  }
  for (const auto& [from, to] : {std::pair{R"("scale":24000)", R"("scale":0)"},
                                 std::pair{R"("scale":24000)", R"("scale":-5)"},
                                 std::pair{R"("spacing":11)", R"("spacing":-1)"},
                                 std::pair{R"("max_eig":6000.0)", R"("max_eig":1e300)"},
                                 std::pair{R"("presmoothing":true)", R"("presmoothing":1)"},
                                 std::pair{R"("border":12,)", ""}}) {
    const auto change = [from = from, to = to](std::string& job) {
      job.replace(job.find(from), std::strlen(from), to);
    };
    EXPECT_EQ(ReasonOf(WithJob(change), 16, true), StateRefused::Reason::Damaged) << to;
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
  EXPECT_EQ(state.result->all_features.frame_count, 1);
  EXPECT_EQ(state.result->all_features.features->at(1).x, 20.5f);
  EXPECT_EQ(state.phase, SolvePhase::Failed);
  EXPECT_EQ(state.result->job_input.StepTime.denominator, 25);
  EXPECT_TRUE(Written(state) == payload);
}

}  // namespace
}  // namespace kelp::effect
