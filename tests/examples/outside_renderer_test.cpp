// The renderer outside of the plug-in draws what the plug-in draws.

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include "examples/outside_renderer/comparison.h"
#include "tests/contract/played_plugin.h"
#include "tests/support/drawn_clip.h"
#include "tests/support/scratch_folder.h"

namespace {

namespace fs = std::filesystem;

constexpr int kLevels = 2;  // of 255

class OutsideRendererProgram : public testing::Test {
 protected:
  OutsideRendererProgram() {
    calmframe::WriteStreet(folder_ / "clip.mkv", calmframe::Made(240, 136, 24, 25, {4, 3}), 3);
  }

  // What it prints. Drivers of OpenGL keep memory to the end.
  std::string Run(const std::string& flags) {
    const std::string command = "ASAN_OPTIONS=detect_leaks=0 " CALMFRAME_OUTSIDE_RENDERER " '" +
                                (folder_ / "clip.mkv").string() + "' '" + folder_.string() +
                                "' --frames 12 " + flags;
    FILE* const pipe = popen(command.c_str(), "r");
    std::string text;
    for (int c; (c = std::fgetc(pipe)) != EOF;) text += static_cast<char>(c);
    EXPECT_EQ(pclose(pipe), 0) << text;
    return text;
  }

  void ExpectThePluginsPictures(const std::string& text, const std::string& drawn_by) {
    std::istringstream lines(text);
    std::string framings;
    for (std::string line; std::getline(lines, line);) {
      int framing = 0, largest = 0, percent = 0;
      if (std::sscanf(line.c_str(), "framing %d: largest difference %d of 255 over at least %d%%",
                      &framing, &largest, &percent) != 3) {
        continue;
      }
      framings += std::to_string(framing);
      EXPECT_LE(largest, kLevels) << text;
      EXPECT_GE(percent, 60) << text;
      EXPECT_TRUE(fs::exists(folder_ / ("framing_" + std::to_string(framing) + ".ppm")));
    }
    EXPECT_EQ(framings, "123") << text;
    EXPECT_NE(text.find(drawn_by), std::string::npos) << text;
  }

 private:
  const ScratchFolder scratch_;
  const fs::path folder_ = scratch_.path();
};

TEST_F(OutsideRendererProgram, DrawsInPlainCode) {
  ExpectThePluginsPictures(Run("--software"), "by plain C++");
}

TEST_F(OutsideRendererProgram, DrawsByOpenGL) {
#ifdef __SANITIZE_THREAD__
  GTEST_SKIP() << "the threads of the driver are not built for the thread sanitizer";
#endif
  const std::string text = Run("");
  if (text.starts_with("no OpenGL")) GTEST_SKIP() << text.substr(0, text.find('\n'));
  ExpectThePluginsPictures(text, " frames a second by the plug-in, ");
  EXPECT_EQ(text.find("by plain C++"), std::string::npos) << text;
}

}  // namespace

namespace calmframe::host {
namespace {

using outside::Framing;

// Indices of the plug-in's controls.
constexpr std::int32_t kActionSafeMargin = 12, kAdditionalScale = 14;

class OutsideRenderer : public PlayedPlugin {};

outside::Picture Drawn(outside::FrameDrawer& drawer, const outside::SolvedFrame& solved,
                       const outside::Controls& controls, const WorldBuffer& source) {
  outside::Picture picture;
  const HX_World& world = source.world();
  drawer.Draw(outside::MeshOf(solved, controls),
              {source.row<HX_Pixel8>(0), world.row_bytes, world.width, world.height}, picture);
  return picture;
}

// Enlarged, held small by its maximum, shrunk with clear edges, and with a margin.
TEST_F(OutsideRenderer, FollowsTheControls) {
  ShakyClip clip;
  clip.tremor = 2;
  Effect& effect = session().Apply(MakeLayer(clip));
  ASSERT_EQ(Settle(effect), 8);
  const outside::Exports exports(host().library().path());
  const auto drawer = outside::MakePlainDrawer();
  const auto renderer = effect.MakeRenderer();
  struct Case {
    Framing framing;
    float margin, maximum, additional;
    double least_share;
  };
  for (const Case& c :
       {Case{Framing::crop_auto_scale, 0, 1.5f, 1.3f, 0.9},
        Case{Framing::crop_auto_scale, 0, 1.02f, 1, 0.5},
        Case{Framing::crop_auto_scale, 0.2f, 1.5f, 0.75f, 0.3},
        Case{Framing::crop, 0, 1.5f, 0.5f, 0.1}, Case{Framing::stabilize_only, 0, 1.5f, 1.1f, 0.5},
        Case{Framing::stabilize_only, 0, 1.5f, 0.6f, 0.2}}) {
    const std::string about = std::to_string(static_cast<int>(c.framing)) + " margin " +
                              std::to_string(c.margin) + " maximum " + std::to_string(c.maximum) +
                              " additional " + std::to_string(c.additional);
    effect.SetParam(kFraming, static_cast<int>(c.framing));
    effect.SetParam(kActionSafeMargin, c.margin * 100);
    effect.SetParam(kMaximumScale, c.maximum * 100);
    effect.SetParam(kAdditionalScale, c.additional * 100);
    ASSERT_EQ(Settle(effect), 8) << about;
    for (const std::int32_t frame : {0, 7, 23}) {
      outside::SolvedFrame solved;
      ASSERT_TRUE(outside::ReadFrame(exports, effect.opaque_data(), frame, solved)) << about;
      const outside::Controls controls{c.framing, c.margin, c.maximum, c.additional};
      const outside::Picture ours = Drawn(*drawer, solved, controls, *SourceFrame(effect, frame));
      const RenderedFrame rendered = renderer->Direct({frame});
      ASSERT_TRUE(rendered.pixels) << about;
      const outside::Picture theirs = outside::CopyOf(rendered.pixels->world());
      const outside::Comparison comparison = outside::Compare(theirs, ours);
      EXPECT_LE(comparison.largest, kLevels) << about << " frame " << frame;
      EXPECT_GE(comparison.share, c.least_share) << about << " frame " << frame;
    }
  }
  // Where the plug-in has edges to make up, and where there is no frame, nobody else draws.
  outside::SolvedFrame solved;
  EXPECT_FALSE(outside::ReadFrame(exports, effect.opaque_data(), 24, solved));
  effect.SetParam(kFraming, 4);
  ASSERT_EQ(Settle(effect), 8);
  EXPECT_FALSE(outside::ReadFrame(exports, effect.opaque_data(), 7, solved));
  EXPECT_FALSE(outside::ReadFrame(exports, nullptr, 7, solved));
}

// The page's code is the example's.
TEST(OutsideDrawing, ThePageShowsWhatIsBuilt) {
  const auto text_of = [](const std::string& name) {
    std::ifstream file(CALMFRAME_ROOT "/" + name);
    return std::string(std::istreambuf_iterator<char>(file), {});
  };
  std::string page = text_of("docs/embedding.md");
  page = page.substr(page.find("## Drawing outside of the plug-in"));
  page = page.substr(0, page.find("\n## "));
  const std::string example = text_of("examples/outside_renderer/outside_renderer.cpp") +
                              text_of("examples/outside_renderer/drawing/exports.cpp");
  const std::string fence = "```cpp\n";
  int snippets = 0;
  for (std::size_t at = 0; (at = page.find(fence, at)) != std::string::npos; ++snippets) {
    at += fence.size();
    const std::string code = page.substr(at, page.find("```", at) - at);
    EXPECT_NE(example.find(code), std::string::npos) << code;
  }
  EXPECT_GE(snippets, 3);
}

// Pixels of no alpha leave no colour, and half-clear ones count by half.
TEST(OutsideDrawing, AlphaWeighsColours) {
  const double resting[] = {0, 0, 4, 0, 0, 1, 4, 1};
  const HX_VarVector warp{resting, {}, 2, 2};
  outside::SolvedFrame solved;
  solved.frame_count = 1;
  solved.columns = solved.rows = 2;
  solved.max_x = 5;  // of other frames
  solved.max_y = 2;
  solved.source_width = 5;
  solved.source_height = 2;
  solved.crop_width = 5;
  solved.crop_height = 2;
  solved.right = 4;
  solved.bottom = 1;
  solved.warp = &warp;
  outside::Controls controls;
  controls.framing = Framing::crop;
  std::vector<HX_Pixel8> pixels;
  for (int y = 0; y < 2; ++y) {
    for (const HX_Pixel8& pixel :
         {HX_Pixel8{255, 200, 100, 0}, HX_Pixel8{0, 9, 9, 9}, HX_Pixel8{85, 50, 250, 250},
          HX_Pixel8{255, 250, 50, 50}, HX_Pixel8{255, 250, 50, 50}}) {
      pixels.push_back(pixel);
    }
  }
  std::vector<std::unique_ptr<outside::FrameDrawer>> drawers;
  drawers.push_back(outside::MakePlainDrawer());
#if !defined(__SANITIZE_ADDRESS__) && \
    !defined(__SANITIZE_THREAD__)  // the drivers are not built for
  try {
    drawers.push_back(outside::MakeGlDrawer());
  } catch (const std::runtime_error&) {
  }
#endif
  for (const auto& drawer : drawers) {
    outside::Picture picture;
    drawer->Draw(outside::MeshOf(solved, controls), {pixels.data(), 20, 5, 2}, picture);
    ASSERT_EQ(picture.width, 5) << drawer->name();
    // Each sample lies half a pixel to the left.
    const HX_Pixel8& half = picture.pixels[1];
    EXPECT_NEAR(half.alpha, 127.5, 1) << drawer->name();
    EXPECT_EQ(half.red, 200) << drawer->name();
    EXPECT_EQ(half.green, 100) << drawer->name();
    const HX_Pixel8& faint = picture.pixels[2];
    EXPECT_NEAR(faint.alpha, 42.5, 1) << drawer->name();
    EXPECT_EQ(faint.green, 250) << drawer->name();
    // (85 * 250 + 255 * 50) / (85 + 255)
    const HX_Pixel8& mixed = picture.pixels[3];
    EXPECT_NEAR(mixed.alpha, 170, 1) << drawer->name();
    EXPECT_NEAR(mixed.green, 100, 1) << drawer->name();
  }
}

}  // namespace
}  // namespace calmframe::host
