#include "synthetic/camera.h"

#include <gtest/gtest.h>

#include <cmath>
#include <numbers>

namespace synthetic {
namespace {

// Turned by 90 degrees to the right, the camera at (1, 2, 3) looks along +x: what lies 4 m to the
// east, 0.5 m lower and 1 m to the south (-z) of it is 4 m ahead, 1 m to the right.
TEST(CameraTest, AQuarterTurnToTheEast) {
  const pinhole camera = {1000, 320, 240};
  const camera_pose pose = {{0, -std::numbers::pi / 2, 0}, {1, 2, 3}};
  const vector3 world = {5, 2.5, 2};
  EXPECT_NEAR(camera_from_world(pose, world)[2], 4, 1e-12);
  const auto pixel = pixel_from_world(camera, pose, world);
  ASSERT_TRUE(pixel);
  EXPECT_NEAR(pixel->x, 320 + 250, 1e-9);
  EXPECT_NEAR(pixel->y, 240 + 125, 1e-9);
  EXPECT_FALSE(pixel_from_world(camera, pose, {-3, 2.5, 2})) << "behind the camera";
}

TEST(CameraTest, BackProjectionMeetsTheSamePixelOfTheFieldOfView) {
  const pinhole camera = centred_pinhole(640, 480, std::numbers::pi / 2);
  EXPECT_NEAR(camera.focal, 320, 1e-10);
  EXPECT_EQ(camera.centre_x, 319.5);
  EXPECT_EQ(camera.centre_y, 239.5);
  const camera_pose pose = {{0.1, -0.4, 0.25}, {2, -1, 7}};
  const vector3 world = world_from_pixel(camera, pose, {123.25, 401.5}, 9.0);
  EXPECT_NEAR(camera_from_world(pose, world)[2], 9.0, 1e-12);
  const auto pixel = pixel_from_world(camera, pose, world);
  ASSERT_TRUE(pixel);
  EXPECT_NEAR(pixel->x, 123.25, 1e-10);
  EXPECT_NEAR(pixel->y, 401.5, 1e-10);
}

}  // namespace
}  // namespace synthetic
