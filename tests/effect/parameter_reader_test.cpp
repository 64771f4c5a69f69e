#include "effect/parameter_reader.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "platform/tessel/debug.h"

namespace kelp::effect {
namespace {

// Index 7 is not declared and has 2.75 by default; id -100 is that of index 3.
class Reader final : public ParameterReader {
 public:
  double value = 0;
  mutable std::int32_t asked = 0;  // for which index the host was asked last

 private:
  std::int32_t IndexOf(std::int32_t id) const override { return id == -100 ? 3 : id; }
  bool IsAbsent(std::int32_t index) const override { return index == 7; }
  double Default(std::int32_t) const override { return 2.75; }
  double Value(std::int32_t index) const override {
    asked = index;
    if (index < 0) throw std::int32_t{7};
    return value;
  }
};

TEST(ParameterReaderTest, TheHostIsAskedByIndexAndNotForAHiddenParameter) {
  Reader reader;
  reader.value = 61.25;
  EXPECT_EQ(reader.GetFloatParam(7), 2.75);
  EXPECT_EQ(reader.GetIntParam(7), 2);
  EXPECT_EQ(reader.GetPopupParam(7), 2);
  EXPECT_TRUE(reader.GetBoolParam(7));
  EXPECT_EQ(reader.asked, 0);
  EXPECT_EQ(reader.GetFloatParam(-100), 61.25);
  EXPECT_EQ(reader.asked, 3);
  EXPECT_EQ(reader.GetPopupParam(98), 61);
  EXPECT_EQ(reader.asked, 98);
  EXPECT_THROW(reader.GetIntParam(-9969), std::int32_t);  // what is no id is an index
  EXPECT_EQ(reader.asked, -9969);
}

TEST(ParameterReaderTest, WholeNumbersOfAnyDouble) {
  Reader reader;
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
    reader.value = c.value;
    EXPECT_EQ(reader.GetIntParam(3), c.whole) << c.value;
  }
  reader.value = 2.9;
  EXPECT_EQ(reader.GetPopupParam(3), 2);
}

TEST(ParameterReaderTest, TheOptionIsAskedOnceAProcess) {
  constexpr char kOption[] = "ShowExperimentalEffectParameters";
  const bool first = ShowsExperimentalParameters();
  tessel::debug::DebugDatabase::Set(kOption, !first);
  EXPECT_EQ(ShowsExperimentalParameters(), first);
  tessel::debug::DebugDatabase::Set(kOption, first);
}

}  // namespace
}  // namespace kelp::effect
