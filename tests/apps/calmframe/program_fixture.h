// The program as a person meets it: run as a process, judged by its exit code, its one line, and
// the files that it leaves.

#pragma once

#include <gmock/gmock.h>
#include <sys/wait.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "host/media/clip.h"
#include "synthetic/texture.h"
#include "tests/support/drawn_clip.h"
#include "tests/support/scratch_folder.h"

namespace calmframe {

namespace fs = std::filesystem;
using media::ClipReader;
using ::testing::HasSubstr;

// Where a camera looks at a flat wall: of its middle, in pixels and radians.
struct Camera {
  double x = 0, y = 0, angle = 0, zoom = 1;
};

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

  // A clip of the camera that at(time) tells, in frames; the second field of an interlaced frame is
  // half a frame later.
  template <class At>
  void MakeWall(const std::string& name, const media::ClipInfo& info, const At& at,
                const media::EncodeSettings& settings = {}) const {
    const synthetic::texture& wall = synthetic::texture_of(synthetic::material::foliage);
    const int later = info.field_order == media::FieldOrder::top_first      ? 1
                      : info.field_order == media::FieldOrder::bottom_first ? 0
                                                                            : -1;  // lines
    const auto draw = [&](int frame, HX_Pixel8* pixels) {
      for (int y = 0; y < info.height; ++y) {
        const Camera camera = at(y % 2 == later ? frame + 0.5 : frame);
        const double c = std::cos(camera.angle) / camera.zoom / wall.side();
        const double s = std::sin(camera.angle) / camera.zoom / wall.side();
        for (int x = 0; x < info.width; ++x) {
          const double dx = x - (info.width - 1) / 2.0, dy = y - (info.height - 1) / 2.0;
          const synthetic::colour seen =
              wall.sample(camera.x / wall.side() + c * dx - s * dy,
                          camera.y / wall.side() + s * dx + c * dy, c, s, -s, c);
          const auto byte = [](float value) { return static_cast<std::uint8_t>(value + 0.5f); };
          *pixels++ = {255, byte(seen[0]), byte(seen[1]), byte(seen[2])};
        }
      }
    };
    WriteClip(Path(name), info, draw, settings);
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
