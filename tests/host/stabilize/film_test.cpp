#include "host/stabilize/film.h"

#include <gtest/gtest.h>

#include <string>
#include <utility>
#include <vector>

#include "host/stabilize/failures.h"
#include "platform/hx/hx_controls.h"
#include "tests/support/drawn_clip.h"
#include "tests/support/given_frames.h"
#include "tests/support/scratch_folder.h"

namespace calmframe::host {
namespace {

constexpr int kFilmWidth = 160, kFilmHeight = 120;

class Patient final : public Watcher {
 public:
  void Show(const Progress&) override {}
  void Warn(const std::string& line) override { ADD_FAILURE() << line; }
  bool Stops() override { return false; }
};

// A street, filmed by a hand, of so many frames.
struct Take {
  unsigned seed;
  int frames;
};

// Where each vertex of a shot's grid lands, frame by frame, and its frames in the film.
struct Worked {
  std::size_t first, end;
  std::vector<Point> vertices;
  bool operator==(const Worked&) const = default;
};

class FilmTest : public testing::Test {
 protected:
  std::string Filmed(const std::string& name, const std::vector<Take>& takes) const {
    std::vector<std::pair<synthetic::scene, int>> scenes;
    std::size_t frames = 0;
    for (const Take& take : takes) {
      synthetic::scene_options options;
      options.width = kFilmWidth;
      options.height = kFilmHeight;
      options.frame_count = take.frames;
      scenes.emplace_back(
          synthetic::scene(synthetic::street(take.seed), synthetic::handheld_path({}), options),
          take.frames);
      frames += static_cast<std::size_t>(take.frames);
    }
    const std::string path = folder_.In(name);
    WriteClip(path, Made(kFilmWidth, kFilmHeight, frames, 25),
              [&](int frame, HX_Pixel8* pixels) {
                std::size_t scene = 0;
                for (; frame >= scenes[scene].second; ++scene) frame -= scenes[scene].second;
                scenes[scene].first.render(frame, pixels, kFilmWidth);
              },
              {.codec = "ffv1", .pixel_format = ""});
    return path;
  }

  // Works all shots of a film and keeps them.
  std::vector<Worked> Work(Film& film) {
    std::vector<Worked> shots;
    while (SteadyClip* const shot = film.Next()) {
      shot->Work(watcher_);
      shots.push_back(
          {shot->range().first, shot->range().end, GivenFrames::Of(shot->Solved()).vertices});
      film.Keep();
    }
    return shots;
  }

  const ScratchFolder folder_;
  Patient watcher_;
};

// The tracks that reach a cut end there as they do at a clip's end; nothing is carried across.
TEST_F(FilmTest, EachShotIsSolvedAsItIsAlone) {
  const std::vector<Take> takes = {{1, 30}, {5, 23}, {9, 40}};
  std::vector<Worked> alone;
  std::size_t first = 0;
  for (const Take& take : takes) {
    Film film(CALMFRAME_PLUGIN, Filmed("of " + std::to_string(take.seed) + ".mkv", {take}));
    alone.push_back(Work(film).at(0));
    EXPECT_EQ(film.Saved().shots.size(), 1u);
    alone.back().first = first;
    first = alone.back().end += first;
  }
  const std::string path = Filmed("film.mkv", takes);
  for (const Opening opening : {Opening::decoded, Opening::promised}) {
    Film film(CALMFRAME_PLUGIN, path, opening);
    const std::vector<Worked> found = Work(film);
    ASSERT_EQ(found.size(), 3u);
    for (std::size_t s = 0; s < 3; ++s) EXPECT_TRUE(found[s] == alone[s]) << s;
    if (opening == Opening::decoded) continue;
    // Saved work is taken up shot by shot, and a run that was stopped goes on to the same end.
    for (std::size_t kept = 1; kept <= 3; ++kept) {
      Project saved = film.Saved();
      EXPECT_EQ(saved.end_frame, 93);
      saved.shots.resize(kept);
      Film again(CALMFRAME_PLUGIN, saved, path);
      EXPECT_TRUE(Work(again) == found) << kept;
    }
  }
}

TEST_F(FilmTest, WhereShotsBeginMayBeTold) {
  const std::string path = Filmed("film.mkv", {{1, 30}, {5, 23}});
  const auto starts = [this](Film& film) {
    std::vector<std::size_t> firsts;
    for (const Worked& shot : Work(film)) firsts.push_back(shot.first);
    return firsts;
  };
  const auto list = [](std::vector<std::int64_t> frames) {
    return ShotRequest{.kind = ShotRequest::Kind::list,
                       .list = [frames](const auto&) { return frames; }};
  };
  using Starts = std::vector<std::size_t>;
  Film one(CALMFRAME_PLUGIN, path, Opening::promised, {}, {.kind = ShotRequest::Kind::one});
  EXPECT_EQ(starts(one), (Starts{0}));
  // Of a stretch, those within it.
  const auto part = [](const media::ClipInfo&) { return media::FrameRange{10, 50}; };
  Film told(CALMFRAME_PLUGIN, path, Opening::promised, part, list({0, 5, 20, 50}));
  EXPECT_EQ(starts(told), (Starts{10, 20}));
  EXPECT_EQ(told.Saved().end_frame, 50);
  // Other shots than the saved ones begin anew, with the controls that were given.
  Project saved = told.Saved();
  saved.shots[0].effect.values[HX_SMOOTHNESS.disk_id] = 80;
  Film more(CALMFRAME_PLUGIN, saved, path, list({20, 31}));
  EXPECT_EQ(starts(more), (Starts{10, 20, 31}));
  EXPECT_EQ(more.Saved().shots.back().effect.values.at(HX_SMOOTHNESS.disk_id), 80);
  // The same ones stand, and so do those of a beginning.
  saved.shots.resize(1);
  Film rest(CALMFRAME_PLUGIN, saved, path, list({20, 31}));
  EXPECT_TRUE(rest.Next()->Work(watcher_).analysis);
  EXPECT_FALSE(rest.Next()->Work(watcher_).analysis);
}

}  // namespace
}  // namespace calmframe::host
