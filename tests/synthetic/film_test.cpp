#include "synthetic/film.h"

#include <gtest/gtest.h>

#include <cmath>

namespace synthetic {
namespace {

scene small_street(int seed) {
  scene_options options;
  options.width = 16;
  options.height = 9;
  return {street(static_cast<std::uint64_t>(seed)), handheld_path({}), options};
}

TEST(FilmTest, FramesAreThoseOfTheShotsMixedAsTold) {
  const scene first = small_street(1), second = small_street(2);
  // 4 frames; 3 mixed, 2 alone; a fade of 3, 1 alone.
  const film all({{&first, 10, 4}, {&second, 30, 2, 3}, {&first, 50, 1, 3, true}}, {{5, 1, 2, 10}});
  ASSERT_EQ(all.frame_count(), 13);
  const struct {
    int frame, of_first, of_second;  // their frames
    double first_part, second_part;
    double gain = 1, lift = 0;
  } cases[] = {
      {0, 10, 0, 1, 0},        {3, 13, 0, 1, 0},
      {4, 14, 30, 0.75, 0.25}, {5, 15, 31, 0.5, 0.5, 2, 10},
      {6, 16, 32, 0.25, 0.75}, {8, 0, 34, 0, 1},
      {9, 50, 35, 0, 0.5},     {10, 51, 36, 0, 0},
      {11, 52, 37, 0.5, 0},    {12, 53, 0, 1, 0},
  };
  for (const auto& c : cases) {
    const auto drawn = all.render(c.frame), a = first.render(c.of_first),
               b = second.render(c.of_second);
    for (std::size_t i = 0; i < drawn.size(); ++i) {
      const double mixed = std::round(c.first_part * a[i].green + c.second_part * b[i].green);
      ASSERT_EQ(drawn[i].green, std::min(255.0, c.gain * mixed + c.lift)) << c.frame;
      ASSERT_EQ(drawn[i].alpha, 255);
    }
  }
}

TEST(FilmTest, WhipPanTurnsToTheRightAndComesToRest) {
  const camera_path whip = with_whip_pans(resting_path({}), {10}, 4, 0.8);
  const pinhole camera = centred_pinhole(100, 50, 1);
  const auto column = [&](double time) {
    return pixel_from_world(camera, whip.shaken(time), {0, 0, 10})->x;
  };
  EXPECT_NEAR(column(10), camera.centre_x, 1e-9);
  // Halfway in time is halfway in angle: what was ahead is to the left.
  EXPECT_NEAR(column(12), camera.centre_x - camera.focal * std::tan(0.4), 1e-9);
  EXPECT_NEAR(column(14), camera.centre_x - camera.focal * std::tan(0.8), 1e-9);
  EXPECT_NEAR(column(99), column(14), 1e-9);
}

}  // namespace
}  // namespace synthetic
