#include "stabilizer/effect/src/table_reader.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <map>
#include <stdexcept>
#include <vector>

#include "analysis/effect/analysis_parameter_rows.h"
#include "platform/tessel/debug.h"

namespace kelp::effect {
namespace {

// A host that keeps a record of what it was asked.
struct Host final : ParameterSource {
  double Value(std::int32_t index) const override {
    asked.push_back(index);
    const auto value = values.find(index);
    if (value == values.end()) throw std::int32_t{7};
    return value->second;
  }
  std::map<std::int32_t, double> values;
  mutable std::vector<std::int32_t> asked;
};

TEST(TableReaderTest, HiddenParametersReadAsDefaultsWithoutAHostCall) {
  Host host;
  for (std::int32_t index = 31; index <= 97; ++index) host.values[index] = 77;
  const TableReader hidden(host, false);
  EXPECT_EQ(hidden.GetIntParam(59), 9);
  EXPECT_EQ(hidden.GetFloatParam(65), 0.0045);
  EXPECT_EQ(hidden.GetIntParam(65), 0);
  EXPECT_TRUE(hidden.GetBoolParam(analysis::effect::kPresmoothingParam));
  EXPECT_FALSE(hidden.GetBoolParam(analysis::effect::kShowTracksParam));
  EXPECT_EQ(hidden.GetPopupParam(kDeblurDebugIndex), 1);
  EXPECT_EQ(hidden.GetIntParam(analysis::effect::kMaxCountParam), 0);
  EXPECT_TRUE(host.asked.empty());

  const TableReader shown(host, true);
  for (const std::int32_t id : {59, 65, 91, 97, -9997, -9974, -9973}) {
    EXPECT_EQ(shown.GetFloatParam(id), 77) << id;
  }
  EXPECT_EQ(host.asked, (std::vector<std::int32_t>{59, 65, 91, 97, 33, 56, 94}));
}

TEST(TableReaderTest, TheRestIsAskedOfTheHostByIndexWhateverTheOption) {
  Host host;
  for (const bool option : {false, true}) {
    const TableReader reader(host, option);
    host.values = {{5, 61.25}, {9, 2}, {17, 1}, {28, 0}, {30, 9808}};
    host.asked.clear();
    EXPECT_EQ(reader.GetFloatParam(kSmoothnessIndex), 61.25);
    EXPECT_EQ(reader.GetPopupParam(kFramingIndex), 2);
    EXPECT_TRUE(reader.GetBoolParam(analysis::effect::kDetailedAnalysisParam));
    EXPECT_FALSE(reader.GetBoolParam(kHideWarningBannerIndex));
    EXPECT_EQ(reader.GetIntParam(analysis::effect::kAnalysisStatusCounterParam), 9808);
    EXPECT_EQ(host.asked, (std::vector<std::int32_t>{5, 9, 17, 28, 30}));
    // What is no id is used as an index as it stands.
    EXPECT_THROW(reader.GetFloatParam(98), std::int32_t);
    EXPECT_THROW(reader.GetIntParam(-9969), std::int32_t);
    EXPECT_EQ(host.asked.back(), -9969);
  }
  EXPECT_THROW(ParameterValues().Value(98), std::out_of_range);
  EXPECT_THROW(ParameterValues().Value(-1), std::out_of_range);
}

TEST(TableReaderTest, WholeNumbersOfAnyDouble) {
  Host host;
  const TableReader reader(host, true);
  const struct {
    double value;
    std::int32_t whole;
  } cases[] = {{8.4, 8},
               {8.5, 9},
               {-0.4, 0},
               {-3, -2},  // not rounding to the nearest under 0, and kept so
               {1e300, std::numeric_limits<std::int32_t>::max()},
               {-std::numeric_limits<double>::infinity(), std::numeric_limits<std::int32_t>::min()},
               {std::nan(""), 0}};
  for (const auto& c : cases) {
    host.values[92] = c.value;
    EXPECT_EQ(reader.GetIntParam(92), c.whole) << c.value;
  }
  host.values[4] = 2.9;
  EXPECT_EQ(reader.GetPopupParam(4), 2);
}

TEST(TableReaderTest, TheOptionIsAskedOnceAProcess) {
  constexpr char kOption[] = "ShowExperimentalEffectParameters";
  tessel::debug::DebugDatabase::Set(kOption, 1);
  const bool first = ShowsExperimentalParameters();
  tessel::debug::DebugDatabase::Set(kOption, 0);
  EXPECT_TRUE(first);
  EXPECT_EQ(ShowsExperimentalParameters(), first);
}

}  // namespace
}  // namespace kelp::effect
