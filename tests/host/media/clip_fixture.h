#pragma once

#include <gmock/gmock.h>

#include <filesystem>
#include <string>
#include <vector>

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

// Each test has a folder of its own.
class ClipTest : public testing::Test, protected ScratchFolder {
 protected:
  static void Ffmpeg(const std::string& arguments) {
    Output("ffmpeg -nostdin -y -v error " + arguments);
  }

  // Line of the failure; the wrong side or none fails the test.
  template <class Action>
  static std::string LineOf(Failure::Side side, Action action) {
    try {
      action();
    } catch (const Failure& failure) {
      EXPECT_EQ(failure.side, side);
      const std::string line = failure.what();
      EXPECT_EQ(line.find('\n'), std::string::npos);
      return line;
    }
    ADD_FAILURE() << "nothing was refused";
    return {};
  }
};

}  // namespace calmframe::media
