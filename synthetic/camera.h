#pragma once

#include <array>
#include <optional>

// The pinhole camera. World and camera axes: x right, y down, z forward, metres. Pixels: the centre
// of the top-left one is (0, 0).
namespace synthetic {

struct point2 {
  double x;
  double y;
};
using vector3 = std::array<double, 3>;
using rotation3 = std::array<double, 9>;  // row-major

// Where a camera stands and how it is turned: a world point X has the camera coordinates
// R (X - centre), R the rotation by |rotation| radians about the axis `rotation`.
struct camera_pose {
  vector3 rotation = {0, 0, 0};
  vector3 centre = {0, 0, 0};
};

struct pinhole {
  double focal;  // pixels
  double centre_x;
  double centre_y;
};

// A camera of the given horizontal field of view whose axis passes through the middle of the frame.
pinhole centred_pinhole(int width, int height, double field_of_view);

// Rotation vector to matrix (Rodrigues, 1840).
rotation3 rotation_matrix(const vector3& rotation);

vector3 camera_from_world(const camera_pose& pose, const vector3& world);

// The point at depth z in front of the camera, on the ray through a pixel.
vector3 world_from_pixel(const pinhole& camera, const camera_pose& pose, point2 pixel,
                         double depth);

// Nothing for a point less than a millimetre in front of the camera, or behind it.
std::optional<point2> pixel_from_world(const pinhole& camera, const camera_pose& pose,
                                       const vector3& world);

}  // namespace synthetic
