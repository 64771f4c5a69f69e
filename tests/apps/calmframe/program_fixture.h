// The program as a person meets it: run as a process, judged by its exit code, its one line, and
// the files that it leaves.

#pragma once

#include <gmock/gmock.h>
#include <sys/wait.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "host/media/clip.h"
#include "tests/support/drawn_clip.h"
#include "tests/support/scratch_folder.h"

namespace calmframe {

namespace fs = std::filesystem;
using media::ClipReader;
using ::testing::HasSubstr;

struct Outcome {
  int code;
  std::string text;  // standard output and error together
};

class ProgramTest : public ::testing::Test {
 protected:
  std::string Path(const std::string& name) const { return scratch_.In(name); }
  std::string Content(const std::string& name) const { return scratch_.Content(name); }

  Outcome Run(const std::string& arguments) const { return RunAfter("", arguments); }

  // `before` stands before the program in the shell's line. A program that a signal ended has the
  // code -1.
  Outcome RunAfter(const std::string& before, const std::string& arguments) const {
    const std::string command = "cd '" + folder_.string() + "' && { " + before +
                                CALMFRAME_PROGRAM " " + arguments + "; } 2>&1";
    Outcome outcome{-1, ""};
    FILE* pipe = popen(command.c_str(), "r");
    std::array<char, 512> part;
    while (std::fgets(part.data(), part.size(), pipe)) outcome.text += part.data();
    const int status = pclose(pipe);
    if (WIFEXITED(status)) outcome.code = WEXITSTATUS(status);
    return outcome;
  }

  // A clip of the synthetic scene.
  void MakeClip(const std::string& name, int width, int height, int frames,
                media::Ratio pixel_aspect = {}) const {
    WriteStreet(Path(name), Made(width, height, frames, 30, pixel_aspect), 1);
  }

  void MakeFile(const std::string& name, const std::string& content) const {
    std::ofstream(Path(name)) << content;
  }

  std::vector<std::string> Files() const {
    std::vector<std::string> names;
    for (const auto& entry : fs::directory_iterator(folder_))
      names.push_back(entry.path().filename());
    std::sort(names.begin(), names.end());
    return names;
  }

  // One line that starts with the program's name, and nothing else.
  static void ExpectOneLine(const Outcome& outcome, const std::string& part) {
    EXPECT_THAT(outcome.text, ::testing::StartsWith("calmframe: "));
    EXPECT_EQ(std::count(outcome.text.begin(), outcome.text.end(), '\n'), 1) << outcome.text;
    EXPECT_THAT(outcome.text, HasSubstr(part));
  }

  const ScratchFolder scratch_;
  const fs::path folder_ = scratch_.path();
};

}  // namespace calmframe
