#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <vector>

#include "platform/hx/hx_pixel.h"
#include "synthetic/camera.h"
#include "synthetic/camera_path.h"
#include "synthetic/texture.h"

namespace synthetic {

// A flat patch of the world: the points origin + a across + b along, 0 <= a <= width, 0 <= b <=
// height, across and along being perpendicular unit vectors. An oval is the ellipse inscribed.
struct surface {
  vector3 origin;
  vector3 across;
  vector3 along;
  double width;   // metres
  double height;  // metres
  material what;
  double repeat_across;  // metres to a repeat of the texture
  double repeat_along;
  colour tint = {1, 1, 1};  // multiplies the texture
  bool oval = false;
};

// A street: road and pavements, houses on both sides, trees, billboards, a skyline and the sky, for
// a camera that starts at z = 0, eye height, looking along +z.
std::vector<surface> street(std::uint64_t seed);

// One textured wall `distance` metres in front of a camera at the origin: a planar scene.
std::vector<surface> wall(double distance);

struct scene_options {
  int width = 640;
  int height = 360;
  double field_of_view = 1.05;  // horizontal, radians
  int frame_count = 100;
  // Time from a frame's first row to its last, as a fraction of the time between frames.
  double readout = 0.0;
  double noise = 0.0;  // deviation of each channel, 0 to 255
  double gain = 0.0;   // each frame's values are multiplied by 1 +- gain and moved by +- bias,
  double bias = 0.0;   // even within those limits; frame 0 stays as it is
  // How long a frame's shutter is open, as a fraction of the time between frames, about the time
  // that locate and depth take for the frame's. Empty or 0: an instant.
  std::function<double(int frame)> exposure = {};
  bool occluder = false;  // a board that crosses the view once, from left to right
  double haze = 150.0;    // metres in which all but 1/e of a thing fades into the distance
  std::uint64_t seed = 1;
};

// Frames of a known world under a known camera, and the true place of what they show. The same
// arguments give the same frames. Rows are drawn on all processors; a scene may be read from
// several threads.
class scene {
 public:
  scene(std::vector<surface> surfaces, camera_path path, const scene_options& options);

  const scene_options& options() const { return options_; }
  const pinhole& camera() const { return camera_; }

  // width x height opaque pixels, row after row, row_pixels from one row to the next.
  void render(int frame, HX_Pixel8* pixels, std::size_t row_pixels) const;
  std::vector<HX_Pixel8> render(int frame) const;

  // Where that which frame `from` shows at a pixel is in frame `to`. Nothing where it is hidden or
  // out of the frame in either, or where `from` shows the occluder or nothing at all.
  std::optional<point2> locate(int from, point2 pixel, int to) const;
  // The same under the path without shake; nothing is held to be hidden there.
  std::optional<point2> locate_intended(int from, point2 pixel, int to) const;

  // Metres from the camera's plane to what a pixel shows.
  std::optional<double> depth(int frame, point2 pixel) const;

 private:
  struct hit;
  std::vector<surface> surfaces_at(double time) const;
  double row_time(int frame, double y) const;
  std::optional<hit> cast(int frame, point2 pixel) const;
  std::optional<point2> project(const std::function<camera_pose(double)>& path, int frame,
                                const vector3& world) const;
  // As they are `shift` after the frame's time.
  void draw_rows(int frame, double shift, int first, int end, HX_Pixel8* pixels,
                 std::size_t row_pixels) const;
  void expose_rows(int frame, int first, int end, HX_Pixel8* pixels, std::size_t row_pixels) const;

  std::vector<surface> surfaces_;
  camera_path path_;
  scene_options options_;
  pinhole camera_;
};

}  // namespace synthetic
