#include "synthetic/scene.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <utility>
#include <vector>

namespace synthetic {
namespace {

camera_path sliding(double metres_a_frame) {
  const auto pose = [=](double t) { return camera_pose{{0, 0, 0}, {metres_a_frame * t, 0, 0}}; };
  return {pose, pose};
}

struct image {
  std::vector<HX_Pixel8> pixels;
  int width;

  double luma(int x, int y) const {
    const HX_Pixel8& p = pixels[y * width + x];
    return 0.3 * p.red + 0.59 * p.green + 0.11 * p.blue;
  }
  // By a sinc of six taps (Lanczos): bilinear interpolation would blur by the fraction and so pull
  // a match to whole pixels.
  double luma(point2 p) const {
    const int x0 = static_cast<int>(std::floor(p.x)), y0 = static_cast<int>(std::floor(p.y));
    double sum = 0, weights = 0;
    for (int y = y0 - 2; y <= y0 + 3; ++y) {
      for (int x = x0 - 2; x <= x0 + 3; ++x) {
        const double w = lanczos(p.x - x) * lanczos(p.y - y);
        sum += w * luma(x, y);
        weights += w;
      }
    }
    return sum / weights;
  }
  bool operator==(const image& other) const {
    return std::memcmp(pixels.data(), other.pixels.data(), pixels.size() * sizeof(HX_Pixel8)) == 0;
  }

  static double lanczos(double t) {
    if (std::abs(t) < 1e-9) return 1;
    return 3 * std::sin(M_PI * t) * std::sin(M_PI * t / 3) / (M_PI * M_PI * t * t);
  }
};

image draw(const scene& world, int frame) {
  return {world.render(frame), world.options().width};
}

// How far from the truth frame `to` shows what some rows of frame `from` show, pixels: where the
// sum of squared differences is least, by a parabola through three places along each axis.
point2 offset_from_truth(const scene& world, int from, int to, int top, int bottom) {
  constexpr double kStep = 0.25;
  const image a = draw(world, from), b = draw(world, to);
  const int width = world.options().width, height = world.options().height;
  double here = 0, left = 0, right = 0, above = 0, below = 0;
  for (int y = top; y < bottom; y += 2) {
    for (int x = 8; x < width - 8; x += 2) {
      const auto q = world.locate(from, {1.0 * x, 1.0 * y}, to);
      if (!q || q->x < 8 || q->y < 8 || q->x > width - 9 || q->y > height - 9) continue;
      const auto square = [&](double dx, double dy) {
        return std::pow(b.luma({q->x + dx, q->y + dy}) - a.luma(x, y), 2);
      };
      here += square(0, 0);
      left += square(-kStep, 0), right += square(kStep, 0);
      above += square(0, -kStep), below += square(0, kStep);
    }
  }
  const auto least = [&](double before, double after) {
    return 0.5 * kStep * (before - after) / (before + after - 2 * here);
  };
  return {least(left, right), least(above, below)};
}

TEST(SceneTruthTest, ASlidingCameraBeforeAWall) {
  const scene world(wall(8), sliding(0.05), {.width = 320, .height = 180, .field_of_view = 1.0});
  const double focal = 160 / std::tan(0.5);
  const auto q = world.locate(2, {200, 71}, 12);
  ASSERT_TRUE(q);
  EXPECT_NEAR(q->x, 200 - focal * 0.5 / 8, 1e-9);
  EXPECT_NEAR(q->y, 71, 1e-9);
  EXPECT_NEAR(*world.depth(2, {200, 71}), 8, 1e-9);
  EXPECT_FALSE(world.locate(0, {5, 71}, 12)) << "out of the frame";
}

TEST(SceneTruthTest, ABoardHidesWhatIsBehindIt) {
  std::vector<surface> both = wall(8);
  both.push_back({{-1, -0.5, 4}, {1, 0, 0}, {0, 1, 0}, 2, 1, material::facade, 2, 2});
  const scene world(both, sliding(0.1), {.width = 320, .height = 180, .field_of_view = 1.0});
  EXPECT_NEAR(*world.depth(0, {159.5, 89.5}), 4, 1e-9);
  const double focal = 160 / std::tan(0.5);
  // From the middle outward: the board ends 1 / 4 of the focal length out.
  EXPECT_NEAR(*world.depth(0, {159.5 + focal / 4 + 1, 89.5}), 8, 1e-9);
  EXPECT_NEAR(*world.depth(0, {159.5 + focal / 4 - 1, 89.5}), 4, 1e-9);
  // After a metre to the left the wall just right of the board has gone behind it.
  EXPECT_FALSE(world.locate(10, {159.5 + 1, 89.5}, 0));
  EXPECT_TRUE(world.locate(0, {159.5 - focal / 4 + 1, 89.5}, 5)) << "the board's own edge stays";
}

TEST(SceneTruthTest, PicturesShowThingsWhereTheTruthSays) {
  const scene flat(wall(8), sliding(0.0037), {.width = 320, .height = 180, .field_of_view = 1.0});
  const point2 planar = offset_from_truth(flat, 0, 10, 8, 172);
  EXPECT_LT(std::hypot(planar.x, planar.y), 0.01);

  for (const double readout : {0.0, 0.8}) {
    const scene deep(street(1), handheld_path({}),
                     {.width = 480, .height = 270, .readout = readout});
    // Parts of a frame that are read at different times.
    for (const auto& [top, bottom] : {std::pair{8, 90}, {90, 180}, {180, 262}}) {
      const point2 walk = offset_from_truth(deep, 20, 21, top, bottom);
      EXPECT_LT(std::hypot(walk.x, walk.y), 0.05) << "readout " << readout << " row " << top;
    }
  }
}

TEST(SceneTest, TheSameWorldGivesTheSameBytesAtAnyStride) {
  scene_options options = {.width = 101,
                           .height = 53,
                           .readout = 0.5,
                           .noise = 2,
                           .gain = 0.1,
                           .bias = 4,
                           .occluder = true};
  const image frame = draw(scene(street(3), handheld_path({}), options), 7);
  std::vector<HX_Pixel8> wide(128 * 53, HX_Pixel8{9, 9, 9, 9});
  scene(street(3), handheld_path({}), options).render(7, wide.data(), 128);
  for (int y = 0; y < 53; ++y) {
    ASSERT_EQ(std::memcmp(&frame.pixels[y * 101], &wide[y * 128], 101 * sizeof(HX_Pixel8)), 0) << y;
    ASSERT_EQ(wide[y * 128 + 101].alpha, 9);
  }
  options.seed = 2;
  EXPECT_FALSE(frame == draw(scene(street(3), handheld_path({}), options), 7));
  for (const HX_Pixel8& p : frame.pixels) ASSERT_EQ(p.alpha, 255);
}

TEST(SceneTest, RowsAreReadAtTheirTime) {
  const scene_options rolling = {.width = 160, .height = 90, .readout = 1.0};
  const scene world(street(1), handheld_path({}), rolling);
  const auto frame = world.render(5);
  scene_options global = rolling;
  global.readout = 0;
  for (const int y : {0, 17, 55, 89}) {
    camera_path later = handheld_path({});
    later.shaken = [shaken = later.shaken, y](double t) { return shaken(t + y / 89.0); };
    const auto still = scene(street(1), later, global).render(5);
    int differ = 0;
    for (int x = 0; x < 160; ++x) {
      differ += std::memcmp(&frame[y * 160 + x], &still[y * 160 + x], sizeof(HX_Pixel8)) != 0;
    }
    // Pixels at outlines are told by the rows above and below, which have other times.
    EXPECT_LT(differ, 24) << "row " << y;
  }
}

// The blur is the camera's way about the frame's time: a box of the pixels that it goes.
TEST(SceneTest, AnOpenShutterBlursAlongTheMotionAlone) {
  scene_options options = {.width = 160, .height = 90};
  const scene sharp(wall(8), sliding(0.6), options);  // 10 pixels a frame
  options.exposure = [](int frame) { return frame == 3 ? 1.0 : 0.0; };
  const scene shot(wall(8), sliding(0.6), options);
  EXPECT_TRUE(draw(sharp, 2) == draw(shot, 2));
  const image a = draw(sharp, 3), b = draw(shot, 3);
  const double pixels = shot.camera().focal * 0.6 / 8;
  double difference = 0, before = 0;
  for (int y = 8; y < 80; ++y) {
    for (int x = 8; x < 150; ++x) {
      double box = 0;
      for (int k = -7; k <= 7; ++k) box += a.luma(point2{x + pixels * k / 15, 1.0 * y}) / 15;
      difference += std::abs(b.luma(x, y) - box);
      before += std::abs(b.luma(x, y) - a.luma(x, y));
    }
  }
  EXPECT_LT(difference, before / 4);
}

TEST(SceneTest, GainAndNoiseSpareTheGeometryAndTheFirstFrame) {
  const scene_options plain = {.width = 160, .height = 90};
  scene_options lit = plain, noisy = plain;
  lit.gain = 0.2;
  lit.bias = 10;
  noisy.noise = 3;
  const auto frame = [](const scene_options& options, int f) {
    return draw(scene(wall(8), sliding(0), options), f);
  };
  EXPECT_TRUE(frame(plain, 0) == frame(lit, 0));
  // Every unclipped value of frame 3 is one straight line of the plain one, but for its noise.
  const image p = frame(plain, 3), q = frame(lit, 3), r = frame(noisy, 3);
  double n = 0, sx = 0, sy = 0, sxx = 0, sxy = 0, square = 0;
  for (std::size_t i = 0; i < p.pixels.size(); ++i) {
    const double x = p.pixels[i].green, y = q.pixels[i].green, off = r.pixels[i].green - x;
    if (x > 200 || x < 20) continue;
    n += 1, sx += x, sy += y, sxx += x * x, sxy += x * y, square += off * off;
  }
  const double slope = (n * sxy - sx * sy) / (n * sxx - sx * sx);
  EXPECT_NE(slope, 1.0);
  EXPECT_NEAR(slope, 1.0, 0.21);
  EXPECT_NEAR(std::sqrt(square / n), 3.0, 0.15);
}

TEST(SceneTest, TheOccluderHidesTheSceneInPassing) {
  scene_options options = {.width = 160, .height = 90, .frame_count = 60, .occluder = true};
  const scene world(wall(20), resting_path({}), options);
  EXPECT_NEAR(*world.depth(30, {79.5, 50}), 4, 1e-9);
  EXPECT_FALSE(world.locate(0, {79.5, 50}, 30)) << "hidden";
  EXPECT_FALSE(world.locate(30, {79.5, 50}, 0)) << "the occluder itself has no truth";
  EXPECT_TRUE(world.locate(0, {79.5, 50}, 59)) << "free again";
}

}  // namespace
}  // namespace synthetic
