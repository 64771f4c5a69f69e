#include "stabilizer/effect/src/solve_hash.h"

#include <gtest/gtest.h>

#include <utility>
#include <vector>

#include "platform/tessel/utility.h"
#include "stabilizer/effect/src/parameter_rules.h"
#include "tests/support/parameter_values.h"

namespace kelp::effect {
namespace {

using Settings = std::vector<std::pair<std::int32_t, double>>;

marrow::stabilization::SolverParamsRecord RecordOf(const Settings& settings,
                                                   bool shows_experimental = true) {
  ParameterValues values(shows_experimental);
  for (const auto& [index, value] : settings) values[index] = value;
  return GetSolverParams(values, {1920, 1080}, 25);
}

// Each experimental parameter of a solve at a number of its own: a field that reads another's
// shows.
Settings Numbered() {
  Settings settings;
  for (std::int32_t index = kRankIndex; index <= kWarpFactorIndex; ++index) {
    const bool is_checkbox =
        index == kUseNewSolverIndex || index == kConservativeFactorizationIndex;
    settings.emplace_back(index, is_checkbox ? 0 : 100 + index);
  }
  return settings;
}

// Numbers found by packing the fields with a script. A field that is left out, moved, added or made
// from something else changes all of them.
TEST(SolveHashTest, WorkedNumbers) {
  ASSERT_EQ(tessel::utility::CRC32("123456789", 9), 0xCBF43926);
  constexpr std::uint32_t kSolve = 0x8F8EC2B4, kCrop = 0x939E6D66;  // at the defaults
  const struct {
    Settings settings;
    std::uint32_t solve, crop;
  } cases[] = {{{}, kSolve, kCrop},
               {{{kResultIndex, 2}}, 0x98F5D6F7, kCrop},
               {{{kSmoothnessIndex, 60}}, 0x43C9D80D, kCrop},  // the transitions' lambda follows it
               {{{kMethodIndex, 2}}, 0xB40D5AFF, kCrop},
               {{{kRollingShutterRippleIndex, 2}}, 0xEB08BCD7, kCrop},
               {{{kFramingIndex, 2}}, kSolve, 0xBDE09B9C},
               {{{kFramingIndex, 1}}, kSolve, 0x20EF7AEA},
               {{{kActionSafeMarginIndex, 5}}, kSolve, 0xF18D43ED},
               {{{kMaximumScaleIndex, 300}}, kSolve, 0x9DB799A3},
               // The maximum counts with auto-scale alone.
               {{{kFramingIndex, 2}, {kMaximumScaleIndex, 300}}, kSolve, 0xBDE09B9C},
               {{{kFramingIndex, 4}, {kMaximumScaleIndex, 300}}, kSolve, 0x20EF7AEA},
               {{{kCropLessSmoothMoreIndex, 75}}, kSolve, 0x7CBC9A08},
               {{{kDetailedAnalysisIndex, 1}, {kSynthesisInputRangeIndex, 9}}, kSolve, kCrop},
               {Numbered(), 0xEB984791, 0x0B4446F8}};
  for (const auto& c : cases) {
    SCOPED_TRACE(&c - cases);
    EXPECT_EQ(SolveHash(RecordOf(c.settings)), c.solve);
    EXPECT_EQ(CropHash(RecordOf(c.settings)), c.crop);
  }
  EXPECT_EQ(SolveHash(RecordOf(Numbered(), false)), kSolve) << "what is hidden has its default";
  EXPECT_EQ(CropHash(RecordOf(Numbered(), false)), kCrop);
  auto record = RecordOf({});
  record.smoothness_lambda = 240;
  EXPECT_EQ(SolveHash(record), 0x911C9E8B);
  record = RecordOf({});
  record.pixel_aspect = 1.4222222f;
  EXPECT_EQ(SolveHash(record), 0x724E340F) << "of pixels that are not square";
}

}  // namespace
}  // namespace kelp::effect
