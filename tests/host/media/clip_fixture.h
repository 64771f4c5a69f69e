#pragma once

#include <gmock/gmock.h>

#include "tests/support/drawn_clip.h"
#include "tests/support/scratch_folder.h"
#include "tests/support/shell.h"

namespace calmframe::media {

// What a command prints; fails the test if the command fails.
inline std::string Output(const std::string& command) {
  const Outcome outcome = Shell(command);
  EXPECT_EQ(outcome.code, 0) << command;
  return outcome.text;
}

// A failure of that side, told in one line.
inline auto Fails(Failure::Side side, const testing::Matcher<std::string>& line) {
  const auto told = [](const Failure& failure) { return std::string(failure.what()); };
  return testing::Throws<Failure>(
      testing::AllOf(testing::Field(&Failure::side, side), testing::ResultOf(told, line),
                     testing::ResultOf(told, testing::Not(testing::HasSubstr("\n")))));
}

// Each test has a folder of its own.
class ClipTest : public testing::Test, protected ScratchFolder {
 protected:
  static void Ffmpeg(const std::string& arguments) {
    Output("ffmpeg -nostdin -y -v error " + arguments);
  }
};

}  // namespace calmframe::media
