#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <fstream>
#include <limits>
#include <sstream>
#include <stdexcept>

#include "analysis/src/identities.h"
#include "stabilizer/effect/src/state_format/state_reader.h"
#include "stabilizer/effect/src/state_format/state_writer.h"
#include "tests/stabilizer/effect/state_format/samples.h"
#include "tests/support/kept_state.h"

namespace kelp::effect {
namespace {

constexpr SourceShape kPresent{64, 36, 1, 1};

SavedState Read(const std::string& payload, std::uint32_t version, bool raw,
                const SourceShape& present = kPresent) {
  return ReadState(payload.data(), payload.size(), version, raw, present);
}

SavedState Read(const std::string& sample, const SourceShape& present = kPresent) {
  const auto& [version, deflated, plain] = ReadSample(sample);
  return Read(deflated, version, false, present);
}

std::string Written(const SavedState& state) {
  tessel::filesupport::OStringByteStream out;
  WriteState(out, state);
  return out.Take();
}

StateRefused Refused(const std::string& payload, std::uint32_t version, bool raw,
                     const SourceShape& present = kPresent) {
  try {
    Read(payload, version, raw, present);
  } catch (const StateRefused& refused) {
    return refused;
  }
  throw std::logic_error("it loads");
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

// All that a state tells, a little of what it holds many of.
std::string Described(const SavedState& state) {
  const auto& [input, source, tracker, table] = *state.result;
  const auto& [warper, crop, solve_hash, crop_hash] = *state.solve_result;
  std::ostringstream text;
  const auto put = [&text](const char* what, const auto&... values) {
    text << what;
    ((text << ' ' << values), ...);
  };
  put("source", state.source.width, state.source.height, state.source.par_num,
      state.source.par_den);
  put(", step", input.StepTime.numerator, input.StepTime.denominator, "of",
      input.Duration.numerator, input.Duration.denominator);
  put(", from", source.ToText().substr(0, 8), "by", tracker.ToText().substr(0, 8), "at",
      state.analysis_tick);
  put(", detailed", boost::logic::indeterminate(state.detailed) ? 2 : bool(state.detailed),
      "pending", state.analysis_pending, "needs solve", state.needs_solve);
  if (const auto& job = state.job) {
    put(", job stage", static_cast<int>(job->job_stage), "spacing", job->selector_params.spacing,
        "threshold", job->selector_params.threshold, "step",
        job->job_input_parameters.StepTime.denominator);
  }
  put(", table", table.frame_count, table.feature_count, "from", table.first_frame);
  const auto cells = marrow::tracking::CellsOf(table);
  for (const auto& cell : *cells) put(";", cell.x, cell.y, cell.status, cell.correlation);
  put(", phase", static_cast<int>(state.phase), solve_hash, crop_hash);
  if (warper) {
    const auto vertex = warper->frameWarp(1)->vertex(2, 0);
    put(", warps", warper->frameWarpCount(), "driven", warper->driven(), "vertex", vertex.x,
        vertex.y);
    marrow::stabilization::matrix3 motion{};
    if (warper->frameMap() && warper->frameMap()->lookup(1, 0, motion)) {
      put(", map", warper->frameMap()->radius(), motion[2], motion[5]);
    }
  }
  if (crop) {
    put(", crop", crop->maskWidth, crop->maskHeight, crop->cropWidth, crop->cropHeight);
    for (const crop_rect& r : crop->rects) put(";", r.left, r.top, r.right, r.bottom);
  }
  return text.str();
}

// samples.txt: what each sample tells, and how what it lacks is filled in.
TEST(StateFormatTest, EachVersionTellsWhatItKnows) {
  std::ifstream file(CALMFRAME_SAMPLES ".txt");
  int samples = 0;
  for (std::string line; std::getline(file, line); ++samples) {
    const std::string name = line.substr(0, line.find(": "));
    EXPECT_EQ(name + ": " + Described(Read(name)), line);
  }
  EXPECT_EQ(samples, 40);
}

// The page's example: its bytes lie in the columns behind four digits of offset.
TEST(StateFormatTest, TheExampleOfThePageIsOne) {
  std::ifstream page(CALMFRAME_DOCS "/state_format.md");
  std::string bytes;
  for (std::string line; std::getline(page, line);) {
    if (line.find_first_not_of("0123456789abcdef") != 4 || line.compare(4, 2, "  ") != 0) continue;
    std::istringstream words(line.substr(6, line.find("  ", 6) - 6));
    for (int byte; words >> std::hex >> byte;) bytes += static_cast<char>(byte);
  }
  const std::string payload = bytes.substr(24);
  EXPECT_EQ(bytes.substr(0, 24), BytesOf(0x10100000010) + BytesOf(0L) + BytesOf(payload.size()));
  const SavedState state = Read(payload, 16, true, {640, 360, 1, 1});
  EXPECT_EQ(Described(state),
            "source 640 360 1 1, step 1 25 of 1 25, from c0c1c2c3 by a0a1a2a3 at 1000, detailed 0 "
            "pending 0 needs solve 0, table 1 2 from 0; 10 12 1 0; 20.5 0 -1 0, phase 4 305419896 "
            "2596069104");
  EXPECT_TRUE(Written(state) == payload);
}

TEST(StateFormatTest, RawIsAnswerableForFromVersion13) {
  for (const char* const name : {"v12_solved", "v13_solved", "v16_solved"}) {
    const auto& [version, deflated, plain] = ReadSample(name);
    const bool raw = version >= 13;
    EXPECT_EQ(Read(raw ? plain : deflated, version, true).result->all_features.frame_count, 2);
    EXPECT_EQ(Refused(raw ? deflated : plain, version, true).reason, StateRefused::Reason::Damaged);
  }
}

TEST(StateFormatTest, AnotherSourceOrGridIsRefused) {
  const std::string payload = ReadSample("v16_solved").plain;
  const StateRefused refused = Refused(payload, 16, true, {128, 72, 1, 1});
  EXPECT_EQ(refused.reason, StateRefused::Reason::SourceSize);
  EXPECT_TRUE(refused.stored.SameSize(kPresent));
  // Anamorphic pixels: the grid is that of 128 by 36.
  EXPECT_EQ(Refused(payload, 16, true, {64, 36, 2, 1}).reason, StateRefused::Reason::Grid);
  // Before sizes were stored the grid alone can tell.
  EXPECT_EQ(Refused(ReadSample("v11_solved").deflated, 11, false, {36, 64, 1, 1}).reason,
            StateRefused::Reason::Grid);
  // Without a layer there is nothing to compare with.
  EXPECT_EQ(Read("v16_solved", {1, 1, 1, 1}).solve_result->warper->frameWidth(), 64);
  EXPECT_EQ(Read("v16_empty", {128, 72, 1, 1}).source.width, 128);
}

// Positions are 32nds of a pixel, halves away from zero; what dead cells hold may be anything.
TEST(StateFormatTest, PositionsAreRoundedAndDeadCellsAreHarmless) {
  SavedState state = Read("v16_solved");
  marrow::tracking::AllFeatures table = TableOf(state);
  table.features =
      boost::make_shared<marrow::tracking::TrackCells>(*marrow::tracking::CellsOf(table));
  table.packed = nullptr;
  KeepTable(state, table);
  auto& cells = *table.features;
  const float nan = std::numeric_limits<float>::quiet_NaN();
  const float infinity = std::numeric_limits<float>::infinity();
  cells[0] = {1.0f + 1.0f / 64, -1.0f - 1.0f / 64, 1, 0.5f};
  cells[1] = {nan, infinity, -1, 0};
  cells[2] = {-1e30f, 2.01f, -4, 0};
  const std::string once = Written(state);
  const SavedState back = Read(once, 16, true);
  const auto read_cells = marrow::tracking::CellsOf(TableOf(back));
  const auto& read = *read_cells;
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

// What is packed holds as much, in less; and as much again where it is written once more.
TEST(StateFormatTest, WhatIsPackedComesBackAsItWas) {
  for (const char* const name : {"v16_solved", "v16_empty"}) {
    const SavedState state = Read(name);
    const auto packed = [](const SavedState& written) {
      tessel::filesupport::OStringByteStream out;
      WriteState(out, written, state_format::PayloadForm::packed);
      return out.Take();
    };
    const std::string once = packed(state);
    const SavedState back = ReadState(once.data(), once.size(), 16, 2, kPresent);
    EXPECT_EQ(Described(back), Described(state));
    EXPECT_TRUE(Written(back) == Written(state));
    EXPECT_TRUE(packed(back) == once);
    if (state.solve_result->warper) {
      EXPECT_LT(once.size(), Written(state).size());
    }
    for (std::size_t i = 0; i < once.size(); ++i) {
      EXPECT_THROW(ReadState(once.data(), i, 16, 2, kPresent), StateRefused) << i;
    }
  }
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

// Later keys may be missing; a wrapped one is one as well; others are damage.
TEST(StateFormatTest, TextsThatAreAJob) {
  const auto later_keys_missing = WithJob([](std::string& job) {
    for (const char* const key : {"eig_ratio_thr", "tolerance_primary_color", "job_stage"}) {
      const std::size_t begin = job.find(key) - 2;
      job.erase(begin, job.find('}', begin) - begin);
    }
  });
  const auto [guid, input, selector, tracker, tracker_guid, stage] =
      *Read(later_keys_missing, 16, true).job;
  EXPECT_EQ(stage, analysis::JobStage::NotStarted);
  EXPECT_EQ(selector.eig_ratio_threshold, 15.0f);
  EXPECT_EQ(tracker_guid, analysis::GetIdentifierForTracker(selector, tracker));
  const auto wrap = [](std::string& job) { job = "{\"SerializerWrappedObject\":" + job + "}"; };
  EXPECT_TRUE(Read(WithJob(wrap), 16, true).job);

  for (const std::size_t units : {65536, 65537}) {
    const std::string padded =
        WithJob([units](std::string& job) { job.append(units - job.size(), ' '); });
    if (units == 65536) {
      EXPECT_TRUE(Read(padded, 16, true).job);
    } else {
      EXPECT_EQ(Refused(padded, 16, true).reason, StateRefused::Reason::Damaged);
    }
  }
  for (const auto& [from, to] : {std::pair{R"("half_winx":5)", R"("half_winx":200)"},
                                 {R"("max_iterations":25)", R"("max_iterations":100)"},
                                 {R"("pyramidal_levels":5)", R"("pyramidal_levels":10)"},
                                 {R"("half_win_x":7)", R"("half_win_x":50)"}}) {
    const auto change = [from = std::string(from), to = to](std::string& job) {
      job.replace(job.find(from), from.size(), to);
    };
    EXPECT_TRUE(Read(WithJob(change), 16, true).job) << to;
  }

  constexpr char kAll[] = "";
  for (const auto& [from, to] :
       {std::pair{kAll, ""},
        {kAll, "{"},
        {kAll, "[]"},
        {kAll, "7"},
        {kAll, "{}"},
        {kAll, R"({"SerializerWrappedObject":7})"},
        {kAll, "\"job\""},
        {R"("scale":24000)", R"("scale":0)"},
        {R"("scale":24000)", R"("scale":-5)"},
        {R"("spacing":11)", R"("spacing":-1)"},
        {R"("max_eig":6000.0)", R"("max_eig":1e300)"},
        {R"("presmoothing":true)", R"("presmoothing":1)"},
        {R"("border":12,)", ""},
        {R"("max_count":500)", R"("max_count":10000)"},
        {R"("half_winx":5)", R"("half_winx":201)"},
        {R"("half_winy":5)", R"("half_winy":201)"},
        {R"("max_iterations":25)", R"("max_iterations":101)"},
        {R"("pyramidal_levels":5)", R"("pyramidal_levels":11)"},
        {R"("half_win_x":7)", R"("half_win_x":51)"},
        // 500 of 10 windows of 103 pixels a side, 12 bytes each: 636 MB
        {R"("pyramidal_levels":5,"half_win_x":7)", R"("pyramidal_levels":10,"half_win_x":50)"},
        {R"("half_win_y":7)", R"("half_win_y":51)"}}) {
    const auto change = [from = std::string(from), to = to](std::string& job) {
      job.replace(job.find(from), from.empty() ? job.size() : from.size(), to);
    };
    EXPECT_EQ(Refused(WithJob(change), 16, true).reason, StateRefused::Reason::Damaged) << to;
  }
}

}  // namespace
}  // namespace kelp::effect
