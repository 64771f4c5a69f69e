#include "host/stabilize/camera_place.h"

#include <cmath>
#include <numbers>

namespace calmframe::host {

std::vector<std::optional<FrameMotion>> MotionsOf(const ShownMotion& shown) {
  std::vector<std::optional<FrameMotion>> motions;
  for (std::size_t f = 1; f < shown.motions.size(); ++f) {
    const Similarity forth = Inverse(shown.motions[f]);  // from the frame before
    motions.push_back(FrameMotion{forth.dx / shown.zooms[f], forth.dy / shown.zooms[f],
                                  std::atan2(forth.b, forth.a), std::hypot(forth.a, forth.b)});
  }
  return motions;
}

std::vector<CameraPlace> PathOf(std::span<const std::optional<FrameMotion>> motions) {
  std::vector<CameraPlace> path(1);
  for (const std::optional<FrameMotion>& motion : motions) {
    CameraPlace place = path.back();
    if (motion) {
      place.x -= motion->shift_x;
      place.y -= motion->shift_y;
      place.angle -= motion->angle * 180 / std::numbers::pi;
      place.zoom *= motion->scale;
    }
    path.push_back(place);
  }
  return path;
}

}  // namespace calmframe::host
