#include "platform/tessel/debug.h"

#include <gmock/gmock.h>

#include <string>

namespace tessel::debug {
namespace {

using ::testing::MatchesRegex;

class DebugTest : public ::testing::Test {
 protected:
  DebugTest() {
    SetSink([this](const std::string& text) { written_ += text; });
  }
  ~DebugTest() override {
    SetSink({});
    DebugDatabase::Set("ShowExperimentalEffectParameters", 0);
    DebugDatabase::Set("Trace.Subspace Stabilizer", 0);
  }
  std::string written_;
};

TEST_F(DebugTest, LogIsSilentUnlessExperimentalParametersShow) {
  Log("frame %d\n", 1);
  EXPECT_EQ(written_, "");
  DebugDatabase::Set("ShowExperimentalEffectParameters", 1);
  Log("frame %d: ", 2);
  Log("%1.2f\n", 3.14159);
  EXPECT_EQ(written_, "frame 2: 3.14\n");
}

TEST_F(DebugTest, TraceLevelsAndTimingEntries) {
  { TimingEntry entry("Subspace Stabilizer", 5, "RunFactorization()"); }
  EXPECT_EQ(written_, "");
  DebugDatabase::Set("Trace.Subspace Stabilizer", 5);
  Trace("Subspace Stabilizer", 6, "too fine");
  EXPECT_EQ(written_, "");
  { TimingEntry entry("Subspace Stabilizer", 5, "RunFactorization()"); }
  EXPECT_THAT(written_,
              MatchesRegex("<[^>]+> <Subspace Stabilizer> <5> Begin - RunFactorization\\(\\)\n"
                           "<[^>]+> <Subspace Stabilizer> <5> End - RunFactorization\\(\\) "
                           "\\[[0-9:.]+ elapsed\\]\n"));
}

TEST_F(DebugTest, OptionsHaveDefaultsAndChangesAreCounted) {
  EXPECT_TRUE(DebugDatabase::GetBool("NeverSet", true));
  EXPECT_FALSE(DebugDatabase::GetBool("NeverSet"));
  const std::uint64_t before = TraceChangeCount();
  EXPECT_EQ(TraceChangeCount(), before);
  DebugDatabase::Set("Trace.Subspace Stabilizer", 6);
  EXPECT_NE(TraceChangeCount(), before);
  EXPECT_TRUE(TraceEnabled("Subspace Stabilizer", 6));
  DebugDatabase::Set("Off", 0);
  EXPECT_FALSE(DebugDatabase::GetBool("Off", true));
}

}  // namespace
}  // namespace tessel::debug
