// The program as a person meets it: run as a process, judged by its exit code, its one line, and
// the files that it leaves.

#pragma once

#include <gmock/gmock.h>

#include <algorithm>
#include <cmath>
#include <set>
#include <string>

#include "synthetic/texture.h"
#include "tests/support/drawn_clip.h"
#include "tests/support/scratch_folder.h"
#include "tests/support/shell.h"

namespace calmframe {

namespace fs = std::filesystem;
using media::ClipReader;
using ::testing::HasSubstr;

// Where a camera looks at a flat wall: of its middle, in pixels and radians.
struct Camera {
  double x = 0, y = 0, angle = 0, zoom = 1;
};

class ProgramTest : public ::testing::Test, protected ScratchFolder {
 protected:
  std::string Path(const std::string& name) const { return In(name); }

  // Standard output and error together; `before` stands before the program in the shell's line.
  Outcome Run(const std::string& arguments, const std::string& before = "") const {
    return Shell("cd '" + path().string() + "' && { " + before + CALMFRAME_PROGRAM " " + arguments +
                 "; } 2>&1");
  }

  // What a run prints that ends well.
  std::string RunWell(const std::string& arguments) const {
    const Outcome outcome = Run(arguments);
    EXPECT_EQ(outcome.code, 0) << arguments << "\n" << outcome.text;
    return outcome.text;
  }
  // A run ends with that code and one line.
  void ExpectLine(const std::string& arguments, int code, const std::string& part) const {
    SCOPED_TRACE(arguments);
    const Outcome outcome = Run(arguments);
    EXPECT_EQ(outcome.code, code);
    ExpectOneLine(outcome, part);
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

  std::set<std::string> Files() const {
    std::set<std::string> names;
    for (const auto& entry : fs::directory_iterator(path())) names.insert(entry.path().filename());
    return names;
  }

  // One line that starts with the program's name, and nothing else.
  static void ExpectOneLine(const Outcome& outcome, const std::string& part) {
    EXPECT_THAT(outcome.text, ::testing::StartsWith("calmframe: "));
    EXPECT_EQ(std::count(outcome.text.begin(), outcome.text.end(), '\n'), 1) << outcome.text;
    EXPECT_THAT(outcome.text, HasSubstr(part));
  }
};

}  // namespace calmframe
