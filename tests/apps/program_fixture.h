// The program as a person meets it: run as a process, judged by its exit code, its one line, and
// the files that it leaves.

#pragma once

#include <gmock/gmock.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "host/media/clip.h"
#include "synthetic/scene.h"

namespace calmframe {

namespace fs = std::filesystem;
using media::ClipInfo;
using media::ClipReader;
using media::ClipWriter;
using ::testing::HasSubstr;

struct Outcome {
  int code;
  std::string text;  // standard output and error together
};

class ProgramTest : public ::testing::Test {
 protected:
  ProgramTest() {
    std::string name = (fs::temp_directory_path() / "calmframe-program-XXXXXX").string();
    folder_ = mkdtemp(name.data());
  }
  ~ProgramTest() override { fs::remove_all(folder_); }

  std::string Path(const std::string& name) const { return folder_ / name; }

  Outcome Run(const std::string& arguments) const {
    const std::string command =
        "cd '" + folder_.string() + "' && " CALMFRAME_PROGRAM " " + arguments + " 2>&1";
    Outcome outcome{-1, ""};
    FILE* pipe = popen(command.c_str(), "r");
    std::array<char, 512> part;
    while (std::fgets(part.data(), part.size(), pipe)) outcome.text += part.data();
    outcome.code = WEXITSTATUS(pclose(pipe));
    return outcome;
  }

  // A clip of the synthetic scene.
  void MakeClip(const std::string& name, int width, int height, int frames,
                media::Ratio pixel_aspect = {}) const {
    ClipInfo info;
    info.width = width;
    info.height = height;
    info.pixel_aspect = pixel_aspect;
    info.frame_rate = {30, 1};
    info.frame_count = static_cast<std::size_t>(frames);
    const auto writer = ClipWriter::Create(Path(name), info, width, height, {});
    synthetic::scene_options options;
    options.width = width;
    options.height = height;
    options.frame_count = frames;
    const synthetic::scene scene(synthetic::street(1), synthetic::handheld_path({}), options);
    std::vector<HX_Pixel8> pixels(static_cast<std::size_t>(width * height));
    for (int f = 0; f < frames; ++f) {
      scene.render(f, pixels.data(), static_cast<std::size_t>(width));
      writer->Write(static_cast<std::size_t>(f), pixels.data(), width * 4);
    }
    writer->Finish();
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

  fs::path folder_;
};

}  // namespace calmframe
