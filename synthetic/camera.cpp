#include "synthetic/camera.h"

#include <cmath>

namespace synthetic {

pinhole centred_pinhole(int width, int height, double field_of_view) {
  return {0.5 * width / std::tan(0.5 * field_of_view), 0.5 * (width - 1), 0.5 * (height - 1)};
}

rotation3 rotation_matrix(const vector3& rotation) {
  const auto [x, y, z] = rotation;
  const double square = x * x + y * y + z * z;
  const double angle = std::sqrt(square);
  // sin(a) / a and (1 - cos(a)) / a^2, by their series where the quotients lose digits.
  const bool small = angle < 1e-4;
  const double s = small ? 1.0 - square / 6.0 : std::sin(angle) / angle;
  const double c = small ? 0.5 - square / 24.0 : (1.0 - std::cos(angle)) / square;
  return {1 - c * (y * y + z * z), c * x * y - s * z,       c * x * z + s * y,
          c * x * y + s * z,       1 - c * (x * x + z * z), c * y * z - s * x,
          c * x * z - s * y,       c * y * z + s * x,       1 - c * (x * x + y * y)};
}

vector3 camera_from_world(const camera_pose& pose, const vector3& world) {
  const rotation3 r = rotation_matrix(pose.rotation);
  const double x = world[0] - pose.centre[0];
  const double y = world[1] - pose.centre[1];
  const double z = world[2] - pose.centre[2];
  return {r[0] * x + r[1] * y + r[2] * z, r[3] * x + r[4] * y + r[5] * z,
          r[6] * x + r[7] * y + r[8] * z};
}

vector3 world_from_pixel(const pinhole& camera, const camera_pose& pose, point2 pixel,
                         double depth) {
  const rotation3 r = rotation_matrix(pose.rotation);
  const double x = depth * (pixel.x - camera.centre_x) / camera.focal;
  const double y = depth * (pixel.y - camera.centre_y) / camera.focal;
  return {r[0] * x + r[3] * y + r[6] * depth + pose.centre[0],
          r[1] * x + r[4] * y + r[7] * depth + pose.centre[1],
          r[2] * x + r[5] * y + r[8] * depth + pose.centre[2]};
}

std::optional<point2> pixel_from_world(const pinhole& camera, const camera_pose& pose,
                                       const vector3& world) {
  const auto [x, y, z] = camera_from_world(pose, world);
  if (!(z >= 1e-3)) return std::nullopt;
  return point2{camera.focal * x / z + camera.centre_x, camera.focal * y / z + camera.centre_y};
}

}  // namespace synthetic
