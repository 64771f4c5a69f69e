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

}  // namespace
}  // namespace tessel::debug
