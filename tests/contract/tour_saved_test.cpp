#include <unistd.h>

#include <array>
#include <cstdio>
#include <filesystem>
#include <string>

#include "tests/support/held_work.h"
#include "tests/contract/played_plugin.h"
#include "tests/contract/saved_file.h"

// Effects that are saved, loaded in a process of their own, and played on.

namespace calmframe::host {
namespace {

class TourSaved : public PlayedPlugin {
 protected:
  TourSaved()
      : folder_(std::filesystem::temp_directory_path() /
                ("calmframe_tour_" + std::to_string(getpid()))) {
    std::filesystem::create_directories(folder_);
  }
  ~TourSaved() override { std::filesystem::remove_all(folder_); }

  static SavedEffect SaveOf(Effect& effect) {
    SavedEffect saved;
    EXPECT_TRUE(effect.Save(&saved).ok());
    return saved;
  }

  struct Played {
    std::string line;
    std::string frames;
  };
  // By play_saved.
  Played PlayElsewhere(const SavedEffect& saved, const std::string& smoothness = "") {
    const std::string file = folder_ / "saved", frames = folder_ / "frames";
    WriteFile(file, BytesOf(saved));
    const std::string command = std::string(CALMFRAME_PLAY_SAVED) + " " + CALMFRAME_PLUGIN + " " +
                                file + " " + frames + " " + smoothness;
    Played played;
    std::FILE* const pipe = popen(command.c_str(), "r");
    std::array<char, 200> line{};
    if (std::fgets(line.data(), static_cast<int>(line.size()), pipe)) played.line = line.data();
    EXPECT_EQ(pclose(pipe), 0);
    played.frames = ReadFile(frames);
    return played;
  }

  static std::int64_t Requests() {
    std::int64_t count = 0;
    for (const std::string& name : Operations::Get().recorded()) {
      count += name == "Video Segment Render.RenderAsync";
    }
    return count;
  }

 private:
  const std::filesystem::path folder_;
};

TEST_F(TourSaved, AnotherProcessShowsTheSameFramesWithoutWork) {
  Effect& effect = session().Apply(MakeLayer());
  for (int framing = 1; framing <= 4; ++framing) {
    effect.SetParam(kFraming, framing);
    ASSERT_EQ(Settle(effect), 8);
    const std::string frames = FrameBytes(*effect.MakeRenderer());
    ASSERT_GT(frames.size(), 100000u);
    const SavedEffect saved = SaveOf(effect);
    EXPECT_TRUE(FrameBytes(*effect.MakeRenderer()) == frames) << "the saved one itself";
    const Played played = PlayElsewhere(saved);
    EXPECT_EQ(played.line, "status 8, 0 changes, 0 requests\n") << framing;
    EXPECT_TRUE(played.frames == frames) << framing;
    EXPECT_EQ(Settle(effect), 8);
  }
}

TEST_F(TourSaved, AnotherProcessSolvesAgainWhatChangedButDoesNotAnalyse) {
  Effect& effect = session().Apply(MakeLayer());
  ASSERT_EQ(Settle(effect), 8);
  const std::string frames = FrameBytes(*effect.MakeRenderer());
  const Played played = PlayElsewhere(SaveOf(effect), "5");
  EXPECT_EQ(played.line.substr(0, 8), "status 8");
  EXPECT_NE(played.line.find(", 0 requests"), std::string::npos) << played.line;
  EXPECT_EQ(played.line.find(", 0 changes"), std::string::npos) << played.line;
  EXPECT_EQ(played.frames.size(), frames.size());
  EXPECT_FALSE(played.frames == frames);
}

// The analysis is the process's: here it goes on, elsewhere it is gone.
TEST_F(TourSaved, SavedInTheMiddleOfItsAnalysis) {
  Operations::Get().Record(true);
  Hold hold;
  ShakyClip clip;
  clip.on_draw = [&hold](std::int64_t frame) {
    if (frame == 5) hold.Pass();
  };
  Effect& effect = session().Apply(MakeLayer(clip));
  const SavedEffect not_begun = SaveOf(effect);
  session().Tick();
  ASSERT_TRUE(hold.Reached(std::chrono::minutes(1)));
  for (int i = 0; i < 3; ++i) session().Tick();
  EXPECT_EQ(Session::StatusOf(effect), 4);
  const SavedEffect middle = SaveOf(effect);
  EXPECT_TRUE(Enabled(effect, kCancel));
  hold.Release();
  ASSERT_EQ(Settle(effect), 8);
  Operations::Get().Record(false);
  EXPECT_LE(Requests(), 24 + 1);
  EXPECT_TRUE(effect.TakeMessages().empty());

  EXPECT_EQ(PlayElsewhere(middle).line, "status 1, 1 changes, 0 requests\n");
  const std::string begun = PlayElsewhere(not_begun).line;
  EXPECT_EQ(begun.substr(0, 8), "status 8");
}

}  // namespace
}  // namespace calmframe::host
