#include "stabilizer/effect/src/solve_hash.h"

#include <gtest/gtest.h>

#include <set>

#include "platform/tessel/utility.h"
#include "stabilizer/effect/src/parameter_rules.h"
#include "tests/support/parameter_values.h"

namespace kelp::effect {
namespace {

using marrow::stabilization::SolverParamsRecord;

SolverParamsRecord RecordOf(const ParameterValues& values) {
  return GetSolverParams(values, {1920, 1080}, 25);
}

// Numbers found by packing the fields with a script.
TEST(SolveHashTest, WorkedNumbers) {
  ASSERT_EQ(tessel::utility::CRC32("123456789", 9), 0xCBF43926);
  ParameterValues values;
  EXPECT_EQ(SolveHash(RecordOf(values)), 0x8F8EC2B4);
  EXPECT_EQ(CropHash(RecordOf(values)), 0x939E6D66);
  values[kFramingIndex] = 2;
  EXPECT_EQ(CropHash(RecordOf(values)), 0xBDE09B9C);
  EXPECT_EQ(SolveHash(RecordOf(values)), 0x8F8EC2B4);
  const auto with = [](std::int32_t index, double value) {
    ParameterValues changed;
    changed[index] = value;
    return SolveHash(RecordOf(changed));
  };
  EXPECT_EQ(with(kSmoothnessIndex, 60), 0x43C9D80D);  // the transitions' lambda follows it
  EXPECT_EQ(with(kResultIndex, 2), 0x98F5D6F7);
  EXPECT_EQ(with(kRollingShutterRippleIndex, 2), 0xEB08BCD7);
  SolverParamsRecord lambda_alone = RecordOf(ParameterValues());
  lambda_alone.smoothness_lambda = 240;
  EXPECT_EQ(SolveHash(lambda_alone), 0x911C9E8B);
  // Each parameter of a solve at a number of its own: a field that reads another's shows.
  ParameterValues numbered;
  for (std::int32_t index = 59; index <= 83; ++index) numbered[index] = 100 + index;
  numbered[kUseNewSolverIndex] = numbered[kConservativeFactorizationIndex] = 0;
  EXPECT_EQ(SolveHash(RecordOf(numbered)), 0xEB984791);
  EXPECT_EQ(CropHash(RecordOf(numbered)), 0x0B4446F8);
}

// Another value for a parameter, of its kind and in its range.
double Another(const ParameterRow& row) {
  switch (row.kind) {
    case HX_PARAM_FLOAT_SLIDER:
      return (row.default_value +
              (row.default_value < row.valid.max ? row.valid.max : row.valid.min)) /
             2;
    case HX_PARAM_POPUP:
      return row.default_value == 1 ? 2 : 1;
    default:
      return 1 - row.default_value;
  }
}

TEST(SolveHashTest, EachParameterChangesTheHashOfWhatItRules) {
  const std::set<std::int32_t> solve = {4,  5,  6,  18, 59, 60, 61, 62, 63, 64, 65, 66, 67,
                                        68, 69, 70, 71, 72, 73, 74, 75, 76, 77, 78, 79, 83};
  const std::set<std::int32_t> crop = {9, 11, 12, 19, 80, 81};
  const SolverParamsRecord before = RecordOf(ParameterValues());
  for (std::int32_t index = 1; index < kParamCount; ++index) {
    SCOPED_TRACE(index);
    ParameterValues values, hidden_values(false);
    values[index] = hidden_values[index] = Another(*ParameterTableRow(index));
    const SolverParamsRecord after = RecordOf(values);
    EXPECT_EQ(SolveHash(after) != SolveHash(before), solve.count(index) == 1);
    EXPECT_EQ(CropHash(after) != CropHash(before), crop.count(index) == 1);
    if (!IsExperimentalIndex(index)) continue;
    const SolverParamsRecord hidden = RecordOf(hidden_values);
    EXPECT_EQ(SolveHash(hidden), SolveHash(before));
    EXPECT_EQ(CropHash(hidden), CropHash(before));
  }
}

TEST(SolveHashTest, MaximumScaleCountsWithAutoScaleAlone) {
  for (const int framing : {1, 2, 4}) {
    ParameterValues values;
    values[kFramingIndex] = framing;
    const std::uint32_t before = CropHash(RecordOf(values));
    values[kMaximumScaleIndex] = 300;
    EXPECT_EQ(CropHash(RecordOf(values)), before) << framing;
  }
}

TEST(SolveHashTest, PixelAspectCountsOnlyWhereItIsNotSquare) {
  SolverParamsRecord params = RecordOf(ParameterValues());
  params.pixel_aspect = 1.0f;
  const std::uint32_t square = SolveHash(params);
  std::set<std::uint32_t> hashes = {square};
  for (const float aspect : {0.9f, 1.0666667f, 1.4222222f}) {
    params.pixel_aspect = aspect;
    hashes.insert(SolveHash(params));
  }
  EXPECT_EQ(hashes.size(), 4u);
  EXPECT_EQ(square, 0x8F8EC2B4);
}

// The frame's size is in the hashes by the limits that are found from it.
TEST(SolveHashTest, FieldsThatDecideNothingAreLeftOut) {
  SolverParamsRecord params = RecordOf(ParameterValues());
  const std::uint32_t solve = SolveHash(params), crop = CropHash(params);
  params.reconstruction_error_threshold += 1;
  params.data_weight += 1;
  params.center_x += 1;
  params.center_y += 1;
  params.transition_tail_overlap += 1;
  EXPECT_EQ(SolveHash(params), solve);
  EXPECT_EQ(CropHash(params), crop);
  params.crop_constant = 2;
  params.use_frame_bounds = false;
  EXPECT_EQ(SolveHash(params), solve);
  EXPECT_NE(CropHash(params), crop);
  params.transition_min_observations = 2;
  params.reconstruction_error_third = 1;
  EXPECT_NE(SolveHash(params), solve);
}

}  // namespace
}  // namespace kelp::effect
