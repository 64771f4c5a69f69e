#include "host/shots/shot_finder.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <vector>

#include "synthetic/film.h"
#include "synthetic/scene.h"

namespace calmframe::host {
namespace {

constexpr int kFrameWidth = 160, kFrameHeight = 96;

struct DrawnShot {
  int frames;
  int mixed = 0;  // frames of a dissolve in front of it
  int whip = -1;  // frame of the shot at which the camera is thrown round
  bool through_black = false;
};

// Streets filmed by a walking hand, one behind the other; light: flashes.
std::vector<ShotBorder> FoundIn(const std::vector<DrawnShot>& shots,
                                const std::vector<synthetic::film_light>& lights = {}) {
  std::vector<std::unique_ptr<synthetic::scene>> scenes;
  std::vector<synthetic::film_shot> parts;
  for (const DrawnShot& shot : shots) {
    const auto seed = static_cast<std::uint64_t>(3 * scenes.size() + 1);
    synthetic::scene_options options;
    options.width = kFrameWidth;
    options.height = kFrameHeight;
    options.frame_count = shot.frames + 200;
    options.noise = 2;
    options.seed = seed;
    synthetic::camera_path path = synthetic::handheld_path({.seed = seed});
    if (shot.whip >= 0) path = synthetic::with_whip_pans(path, {100 + shot.whip}, 8, 1.5);
    scenes.push_back(std::make_unique<synthetic::scene>(synthetic::street(seed), path, options));
    parts.push_back({scenes.back().get(), 100, shot.frames, shot.mixed, shot.through_black});
  }
  const synthetic::film film(parts, lights);
  ShotFinder finder({.frames_per_second = 25});
  std::vector<ShotBorder> found;
  const auto take = [&] {
    for (const ShotBorder& border : finder.Take()) found.push_back(border);
  };
  for (int f = 0; f < film.frame_count(); ++f) {
    const std::vector<HX_Pixel8> pixels = film.render(f);
    finder.Add(DigestOf(ArgbView{pixels.data(),
                                 kFrameWidth * static_cast<std::ptrdiff_t>(sizeof(HX_Pixel8)),
                                 kFrameWidth, kFrameHeight}));
    take();
  }
  finder.Finish();
  take();
  return found;
}

TEST(ShotFinderTest, EveryCutIsFoundAtItsFrameAndNothingElseIsOne) {
  // Whip pans and flashes of one and three frames are none; nor is a lamp that goes on and stays.
  const std::vector<DrawnShot> shots = {{40}, {12}, {30, 0, 12}, {6},  {50}, {25, 0, 8},
                                        {33}, {12}, {60, 0, 30}, {20}, {45}, {28}};
  const std::vector<synthetic::film_light> lights = {
      {20, 1, 2.5, 60}, {100, 3, 2, 80}, {215, 1, 3, 100}, {310, 40, 1.5, 10}};
  std::vector<std::int64_t> expected;
  std::int64_t frame = 0;
  for (const DrawnShot& shot : shots) {
    if (frame > 0) expected.push_back(frame);
    frame += shot.frames;
  }
  std::vector<std::int64_t> found;
  for (const ShotBorder& border : FoundIn(shots, lights)) {
    EXPECT_EQ(border.kind, ShotBorder::Kind::cut) << border.frame;
    found.push_back(border.frame);
  }
  EXPECT_EQ(found, expected);
}

TEST(ShotFinderTest, DissolvesAndFadesHaveTheirMiddle) {
  const std::vector<DrawnShot> shots = {{60}, {70, 16}, {70, 24}, {70, 32}, {60, 24, -1, true}};
  const std::vector<ShotBorder> found = FoundIn(shots);
  std::vector<std::int64_t> middles;
  std::int64_t frame = shots[0].frames;
  for (std::size_t s = 1; s < shots.size(); ++s) {
    middles.push_back(frame + shots[s].mixed / 2);
    frame += shots[s].mixed + shots[s].frames;
  }
  EXPECT_GE(found.size() + 1, middles.size());  // one may be missed, and none made up
  for (const ShotBorder& border : found) {
    const auto middle = std::find_if(middles.begin(), middles.end(), [&](std::int64_t m) {
      return std::abs(m - border.frame) <= 3;
    });
    ASSERT_NE(middle, middles.end()) << border.frame;
    EXPECT_EQ(border.kind,
              middle + 1 == middles.end() ? ShotBorder::Kind::fade : ShotBorder::Kind::dissolve);
  }
}

}  // namespace
}  // namespace calmframe::host
