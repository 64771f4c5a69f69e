#include <gmock/gmock.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>

#include "host/project/project_file.h"
#include "tests/contract/played_plugin.h"
#include "tests/support/held_work.h"
#include "tests/support/scratch_folder.h"

// Effects that are saved, loaded in a process of their own, and played on.

namespace calmframe::host {
namespace {

const ShakyClip kClip{160, 120, 24, "saved clip"};

// Some frames in every depth, by both paths, with their places.
std::string FrameBytes(Renderer& renderer) {
  std::string bytes;
  for (const std::int64_t frame : {0, 5, 23}) {
    for (const int depth : {8, 16, 32, -8, -16}) {  // negative: the direct path
      const RenderedFrame rendered =
          depth > 0 ? renderer.Planned({frame, depth}) : renderer.Direct({frame, -depth});
      if (!rendered.pixels) return "no frame";
      const HX_World& world = rendered.pixels->world();
      const std::int32_t place[] = {world.width, world.height, world.origin_x, world.origin_y};
      bytes.append(reinterpret_cast<const char*>(place), sizeof place);
      const std::size_t row_bytes = static_cast<std::size_t>(world.width) * std::abs(depth) / 8 * 4;
      for (int y = 0; y < world.height; ++y) {
        bytes.append(rendered.pixels->row<const char>(y), row_bytes);
      }
    }
  }
  return bytes;
}

class TourSaved : public PlayedPlugin {
 protected:
  struct Played {
    std::string line;  // its status at the end, what of it changed, what was analysed
    std::string frames;
  };

  // By DISABLED_InAnotherProcess, in one.
  Played PlayElsewhere(const SavedEffect& saved, const std::string& smoothness = "") {
    Project project;
    project.clip_path = "none";
    project.ticks_per_frame = 1;
    project.shots.front().effect = saved;
    SaveProject(folder_.In("saved"), project);
    const std::string self = std::filesystem::read_symlink("/proc/self/exe");
    const std::string command =
        "cd '" + folder_.path().string() + "' && CALMFRAME_SMOOTHNESS='" + smoothness + "' " +
        self + " --gtest_also_run_disabled_tests --gtest_filter=TourSaved.DISABLED_* >log 2>&1";
    EXPECT_EQ(std::system(command.c_str()), 0) << folder_.Content("log");
    return {folder_.Content("line"), folder_.Content("frames")};
  }

 private:
  const ScratchFolder folder_;
};

TEST_F(TourSaved, DISABLED_InAnotherProcess) {
  const SavedEffect saved = LoadProject("saved").shots.front().effect;
  Effect& effect = session().Load(MakeLayer(kClip), saved);
  if (const std::string smoothness = std::getenv("CALMFRAME_SMOOTHNESS"); !smoothness.empty()) {
    effect.SetParam(kSmoothness, std::stod(smoothness));
  }
  const int status = Settle(effect);
  // Hundreds of the counter count.
  const auto changes = [](double counter) { return static_cast<int>(counter) / 100; };
  const int before = changes(saved.values.at(Session::kStatusDiskId));
  std::ofstream("line") << "status " << status << ", "
                        << changes(*ValueOf(*effect.Param(kStatusCounter))) - before << " changes, "
                        << Analysed() << " requests";
  std::ofstream("frames", std::ios::binary) << FrameBytes(*effect.MakeRenderer());
}

TEST_F(TourSaved, AnotherProcessShowsTheSameFramesWithoutWorkAndSolvesWhatChanged) {
  Effect& effect = session().Apply(MakeLayer(kClip));
  for (int framing = 1; framing <= 4; ++framing) {
    SCOPED_TRACE(framing);
    effect.SetParam(kFraming, framing);
    ASSERT_EQ(Settle(effect), kReady);
    const std::string frames = FrameBytes(*effect.MakeRenderer());
    ASSERT_GT(frames.size(), 100000u);
    const SavedEffect saved = Saved(effect);
    EXPECT_TRUE(FrameBytes(*effect.MakeRenderer()) == frames) << "the saved one itself";
    const Played played = PlayElsewhere(saved);
    EXPECT_EQ(played.line, "status 8, 0 changes, 0 requests");
    EXPECT_TRUE(played.frames == frames);
    const Played changed = PlayElsewhere(saved, "5");
    EXPECT_THAT(changed.line, testing::MatchesRegex("status 8, [1-9] changes, 0 requests"));
    EXPECT_GT(changed.frames.size(), 100000u);
    EXPECT_FALSE(changed.frames == frames);
    EXPECT_EQ(Settle(effect), kReady);
  }
}

// The analysis is the process's: here it goes on, elsewhere it is gone.
TEST_F(TourSaved, SavedInTheMiddleOfItsAnalysis) {
  Hold hold;
  ShakyClip clip = kClip;
  clip.on_draw = [&hold](std::int64_t frame) {
    if (frame == 5) hold.Pass();
  };
  Effect& effect = session().Apply(MakeLayer(clip));
  const SavedEffect not_begun = Saved(effect);
  session().Tick();
  ASSERT_TRUE(hold.Reached(1min));
  for (int i = 0; i < 3; ++i) session().Tick();
  EXPECT_EQ(Session::StatusOf(effect), 4);
  const SavedEffect middle = Saved(effect);
  EXPECT_TRUE(Enabled(effect, kCancel));
  hold.Release();
  ASSERT_EQ(Settle(effect), kReady);
  EXPECT_EQ(Analysed(), 24u);
  EXPECT_TRUE(effect.TakeMessages().empty());

  EXPECT_EQ(PlayElsewhere(middle).line, "status 1, 1 changes, 0 requests");
  EXPECT_THAT(PlayElsewhere(not_begun).line,
              testing::MatchesRegex("status 8, [1-9] changes, 24 requests"));
}

}  // namespace
}  // namespace calmframe::host
