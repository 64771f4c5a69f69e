// The renderer outside of the plug-in draws what the plug-in draws.

#include <cstdio>
#include <filesystem>
#include <sstream>
#include <stdexcept>

#include "examples/outside_renderer/comparison.h"
#include "tests/contract/played_plugin.h"
#include "tests/support/drawn_clip.h"
#include "tests/support/scratch_folder.h"
#include "tests/support/shell.h"

namespace {

constexpr int kLevels = 2;  // of 255

class OutsideRendererProgram : public testing::Test, protected ScratchFolder {
 protected:
  // What it prints. Drivers of OpenGL keep memory to the end.
  std::string Run(const std::string& flags) {
    calmframe::WriteStreet(In("clip.mkv"), calmframe::Made(240, 136, 24, 25, {4, 3}), 3);
    const calmframe::Outcome outcome =
        calmframe::Shell("ASAN_OPTIONS=detect_leaks=0 " CALMFRAME_OUTSIDE_RENDERER " '" +
                         In("clip.mkv") + "' '" + In("") + "' --start 5 --frames 12 " + flags);
    EXPECT_EQ(outcome.code, 0) << outcome.text;
    return outcome.text;
  }

  void ExpectThePluginsPictures(const std::string& text, const std::string& drawn_by) {
    std::istringstream lines(text);
    std::string framings;
    for (std::string line; std::getline(lines, line);) {
      char framing;
      int levels, percent;
      if (std::sscanf(line.c_str(), "framing %c: largest difference %d of 255 over at least %d%%",
                      &framing, &levels, &percent) != 3) {
        continue;
      }
      framings += framing;
      EXPECT_LE(levels, kLevels) << text;
      EXPECT_GE(percent, 60) << text;
      EXPECT_TRUE(std::filesystem::exists(In(std::string("framing_") + framing + ".ppm")));
    }
    EXPECT_EQ(framings, "123") << text;
    EXPECT_NE(text.find(drawn_by), std::string::npos) << text;
  }
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

class OutsideRenderer : public PlayedPlugin {};

// Enlarged, held small by its maximum, shrunk with clear edges, and with a margin.
TEST_F(OutsideRenderer, FollowsTheControls) {
  ShakyClip clip;
  clip.tremor = 2;
  clip.width = 346;  // 315 wide in square pixels
  clip.aspect = {10, 11};
  constexpr std::int32_t kStart = 4, kEnd = 24;
  const auto layer = MakeLayer(clip);
  Trim(*layer, kStart, kEnd - kStart);
  Effect& effect = session().Apply(layer);
  ASSERT_EQ(Settle(effect), 8);
  const outside::Exports exports(host().library().path());
  const auto drawer = outside::MakePlainDrawer();
  const auto renderer = effect.MakeRenderer();
  const struct {
    outside::Controls controls;
    double least_share;
  } cases[] = {{{Framing::crop_auto_scale, 0, 1.5f, 1.3f}, 0.9},
               {{Framing::crop_auto_scale, 0, 1.02f, 1}, 0.5},
               {{Framing::crop_auto_scale, 0.2f, 1.5f, 0.75f}, 0.3},
               {{Framing::crop, 0, 1.5f, 0.5f}, 0.1},
               {{Framing::stabilize_only, 0, 1.5f, 1.1f}, 0.5},
               {{Framing::stabilize_only, 0, 1.5f, 0.6f}, 0.2}};
  for (auto [controls, least_share] : cases) {
    controls.pixel_aspect_num = clip.aspect.num;
    controls.pixel_aspect_den = static_cast<std::int32_t>(clip.aspect.den);
    SCOPED_TRACE(testing::Message()
                 << static_cast<int>(controls.framing) << " margin " << controls.action_safe_margin
                 << " maximum " << controls.maximum_scale << " additional "
                 << controls.additional_scale);
    effect.SetParam(kFraming, static_cast<int>(controls.framing));
    effect.SetParam(kActionSafeMargin, controls.action_safe_margin * 100);
    effect.SetParam(kMaximumScale, controls.maximum_scale * 100);
    effect.SetParam(kAdditionalScale, controls.additional_scale * 100);
    ASSERT_EQ(Settle(effect), 8);
    // Trimmed before the analysis, and some more after it.
    const struct {
      std::int32_t start, frame;
    } shown[] = {{kStart, 0}, {kStart, 7}, {kStart, 19}, {9, 0}, {9, 14}};
    for (const auto& [start, frame] : shown) {
      Trim(*layer, start, kEnd - start);
      outside::SolvedFrame solved;
      ASSERT_TRUE(outside::ReadFrame(exports, effect.opaque_data(), frame, start, solved)) << frame;
      const auto source = SourceFrame(effect, start + frame);
      const HX_World& world = source->world();
      outside::Picture ours;
      drawer->Draw(outside::MeshOf(solved, controls),
                   {source->row<HX_Pixel8>(0), world.row_bytes, world.width, world.height}, ours);
      const RenderedFrame rendered = renderer->Direct({frame});
      ASSERT_TRUE(rendered.pixels) << frame;
      const outside::Comparison comparison =
          outside::Compare(outside::CopyOf(rendered.pixels->world()), ours);
      EXPECT_LE(comparison.largest, kLevels) << frame;
      EXPECT_GE(comparison.share, least_share) << frame;
    }
  }
  // Where the plug-in has edges to make up, and where there is no frame, nobody else draws.
  outside::SolvedFrame solved;
  EXPECT_FALSE(outside::ReadFrame(exports, effect.opaque_data(), 15, 9, solved));
  effect.SetParam(kFraming, 4);
  ASSERT_EQ(Settle(effect), 8);
  EXPECT_FALSE(outside::ReadFrame(exports, effect.opaque_data(), 7, 9, solved));
  EXPECT_FALSE(outside::ReadFrame(exports, nullptr, 7, 9, solved));
}

// Pixels of no alpha leave no colour, and half-clear ones count by half.
TEST(OutsideDrawing, AlphaWeighsColours) {
  const double resting[] = {0, 0, 4, 0, 0, 1, 4, 1};
  const HX_VarVector warp{resting, {}, 2, 2};
  outside::SolvedFrame solved;
  solved.frame_count = 1;
  solved.columns = solved.rows = 2;
  solved.max_x = solved.source_width = solved.crop_width = 5;  // max_x, max_y: of other frames
  solved.max_y = solved.source_height = solved.crop_height = 2;
  solved.right = 4;
  solved.bottom = 1;
  solved.warp = &warp;
  const outside::Controls controls{.framing = Framing::crop};
  const HX_Pixel8 clear{0, 9, 9, 9}, faint{85, 50, 250, 250}, full{255, 250, 50, 50};
  const HX_Pixel8 first{255, 200, 100, 0};
  const HX_Pixel8 pixels[] = {first, clear, faint, full, full, first, clear, faint, full, full};
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
    drawer->Draw(outside::MeshOf(solved, controls), {pixels, 20, 5, 2}, picture);
    ASSERT_EQ(picture.width, 5) << drawer->name();
    // Each sample lies half a pixel to the left.
    EXPECT_NEAR(picture.pixels[1].alpha, 127.5, 1) << drawer->name();
    EXPECT_EQ(picture.pixels[1].red, 200) << drawer->name();
    EXPECT_EQ(picture.pixels[1].green, 100) << drawer->name();
    EXPECT_NEAR(picture.pixels[2].alpha, 42.5, 1) << drawer->name();
    EXPECT_EQ(picture.pixels[2].green, 250) << drawer->name();
    // (85 * 250 + 255 * 50) / (85 + 255)
    EXPECT_NEAR(picture.pixels[3].alpha, 170, 1) << drawer->name();
    EXPECT_NEAR(picture.pixels[3].green, 100, 1) << drawer->name();
  }
}

}  // namespace
}  // namespace calmframe::host
