#include "synthetic/track_world.h"

#include <boost/make_shared.hpp>
#include <cmath>
#include <numbers>
#include <optional>
#include <stdexcept>

#include "synthetic/random.h"

namespace synthetic {
namespace {

constexpr double kSeedInset = 17.0;  // pixels; a tracker's window must fit around a point
constexpr double kLiveInset = 16.0;

using motion = std::function<camera_pose(double)>;

// What a pixel shows and where that is seen at another time. For the plane motions a "world point"
// is a pixel of the unmoved image with depth 1.
class projector {
 public:
  explicit projector(const track_world_options& options)
      : options_(options),
        camera_{options.focal, 0.5 * (options.width - 1), 0.5 * (options.height - 1)} {}

  vector3 point_under(const motion& path, int frame, point2 pixel, double depth) const {
    const camera_pose pose = path(row_time(frame, pixel.y));
    switch (options_.scene) {
      case track_scene::depth:
        return world_from_pixel(camera_, pose, pixel, depth);
      case track_scene::planar: {
        // The plane n . X = distance, met along the pixel's ray.
        const vector3 n = {0.2, -0.3, 0.9327379053088816};
        constexpr double distance = 12.0;
        const vector3 ray = world_from_pixel(camera_, {pose.rotation, {0, 0, 0}}, pixel, 1.0);
        const vector3& c = pose.centre;
        const double along = (distance - n[0] * c[0] - n[1] * c[1] - n[2] * c[2]) /
                             (n[0] * ray[0] + n[1] * ray[1] + n[2] * ray[2]);
        return {c[0] + along * ray[0], c[1] + along * ray[1], c[2] + along * ray[2]};
      }
      case track_scene::translation:
      case track_scene::similarity: {
        const plane_motion m = plane(pose);
        const double x = pixel.x - camera_.centre_x - m.tx;
        const double y = pixel.y - camera_.centre_y - m.ty;
        return {(m.cosine * x + m.sine * y) / m.square + camera_.centre_x,
                (-m.sine * x + m.cosine * y) / m.square + camera_.centre_y, 1.0};
      }
      case track_scene::still:
        break;
    }
    return {pixel.x, pixel.y, 1.0};
  }

  std::optional<point2> pixel_of(const motion& path, int frame, const vector3& world) const {
    if (options_.readout == 0.0) return pixel_at(path(frame), world);
    // A row is read at a time that depends on the row: a contraction, as the image moves by far
    // less than the frame's height while it is read.
    std::optional<point2> pixel = pixel_at(path(row_time(frame, camera_.centre_y)), world);
    for (int k = 0; k < 50 && pixel; ++k) {
      const double y = pixel->y;
      pixel = pixel_at(path(row_time(frame, y)), world);
      if (pixel && std::abs(pixel->y - y) < 1e-10) break;
    }
    return pixel;
  }

 private:
  struct plane_motion {
    double cosine;  // times the scale
    double sine;
    double square;  // of the scale
    double tx;
    double ty;
  };

  plane_motion plane(const camera_pose& pose) const {
    const bool turns = options_.scene == track_scene::similarity;
    const double angle = turns ? pose.rotation[2] : 0.0;
    const double scale = turns ? std::exp(0.1 * pose.centre[2]) : 1.0;
    return {scale * std::cos(angle), scale * std::sin(angle), scale * scale,
            options_.focal * pose.rotation[1], options_.focal * pose.rotation[0]};
  }

  double row_time(int frame, double y) const {
    return frame + options_.readout * y / (options_.height - 1);
  }

  std::optional<point2> pixel_at(const camera_pose& pose, const vector3& world) const {
    switch (options_.scene) {
      case track_scene::depth:
      case track_scene::planar:
        return pixel_from_world(camera_, pose, world);
      case track_scene::translation:
      case track_scene::similarity: {
        const plane_motion m = plane(pose);
        const double x = world[0] - camera_.centre_x;
        const double y = world[1] - camera_.centre_y;
        return point2{m.cosine * x - m.sine * y + m.tx + camera_.centre_x,
                      m.sine * x + m.cosine * y + m.ty + camera_.centre_y};
      }
      case track_scene::still:
        break;
    }
    return point2{world[0], world[1]};
  }

  const track_world_options& options_;
  pinhole camera_;
};

struct live_point {
  vector3 world;
  bool outlier;
  point2 drift;  // pixels a frame
  int age;
};

class generator {
 public:
  explicit generator(const track_world_options& options)
      : options_(options),
        projector_(options),
        path_(jittered_path(options.frame_count, {options.gain, options.rotation_jitter,
                                                  options.translation_jitter, options.seed})),
        lives_(substream(options.seed, 1)),
        noise_(substream(options.seed, 2)) {}

  track_world run() {
    const auto slots = static_cast<std::size_t>(options_.slots);
    const auto frames = static_cast<std::size_t>(options_.frame_count);
    track_world world;
    world.features.feature_count = options_.slots;
    world.features.frame_count = options_.frame_count;
    world.features.features->assign(slots * frames,
                                    {0.0f, 0.0f, marrow::tracking::feature_status::kEmpty, 0.0f});
    constexpr double nan = std::numeric_limits<double>::quiet_NaN();
    world.exact.assign(slots * frames, {nan, nan});
    world.intended.assign(slots * frames, {nan, nan});
    world.outlier.assign(slots * frames, 0);

    std::vector<std::optional<live_point>> live(slots);
    for (int f = 0; f < options_.frame_count; ++f) {
      for (std::size_t s = 0; s < slots; ++s) {
        if (in_hole(f)) {
          live[s].reset();
          continue;
        }
        if (live[s] && !survives(*live[s], f)) live[s].reset();
        const bool seed = !live[s];
        if (seed) live[s] = new_point(f);
        write(*live[s], seed, f, world, world.cell(static_cast<std::size_t>(f), s));
      }
    }
    world.global = boost::make_shared<marrow::stabilization::stabilizer_global>();
    FillStabilizerGlobal(*world.global, slots, frames, world.features, 1.0f);
    return world;
  }

 private:
  bool in_hole(int frame) const {
    return frame >= options_.hole.first && frame < options_.hole.end;
  }

  bool covered(int frame, point2 p) const {
    if (!options_.occluder) return false;
    const double bar = 0.15 * options_.width;
    const double left = -bar + (options_.width + bar) * frame / options_.frame_count;
    return p.x >= left && p.x < left + bar;
  }

  bool seen(const live_point& point, int frame) const {
    const auto p = projector_.pixel_of(path_.shaken, frame, point.world);
    if (!p || covered(frame, *p)) return false;
    const point2 drawn = {p->x + point.drift.x * point.age, p->y + point.drift.y * point.age};
    return drawn.x >= kLiveInset && drawn.x <= options_.width - 1 - kLiveInset &&
           drawn.y >= kLiveInset && drawn.y <= options_.height - 1 - kLiveInset;
  }

  bool survives(live_point& point, int frame) {
    ++point.age;
    if (!options_.whole_clip && lives_.uniform() * options_.mean_life < 1.0) return false;
    return seen(point, frame);
  }

  // Whether the point is seen from its first frame to the next hole or the clip's end.
  bool stays(live_point point, int frame) const {
    for (int f = frame; f < options_.frame_count && !in_hole(f); ++f, ++point.age) {
      if (!seen(point, f)) return false;
    }
    return true;
  }

  live_point new_point(int frame) {
    constexpr int kTries = 100000;
    for (int k = 0; k < kTries; ++k) {
      const point2 pixel = {lives_.uniform(kSeedInset, options_.width - 1 - kSeedInset),
                            lives_.uniform(kSeedInset, options_.height - 1 - kSeedInset)};
      live_point point{};
      point.world = projector_.point_under(path_.shaken, frame, pixel, lives_.uniform(5.0, 25.0));
      point.outlier = lives_.uniform() < options_.outlier_share;
      const double speed = lives_.uniform(0.5, 3.0);
      const double heading = lives_.uniform(0.0, 2.0 * std::numbers::pi);
      if (point.outlier) point.drift = {speed * std::cos(heading), speed * std::sin(heading)};
      if (options_.whole_clip ? stays(point, frame) : seen(point, frame)) return point;
    }
    throw std::runtime_error("track_world: no point stays in the frame for the whole clip");
  }

  void write(const live_point& point, bool seed, int frame, track_world& world, std::size_t cell) {
    const point2 exact = *projector_.pixel_of(path_.shaken, frame, point.world);
    world.exact[cell] = exact;
    if (const auto p = projector_.pixel_of(path_.intended, frame, point.world)) {
      world.intended[cell] = *p;
    }
    world.outlier[cell] = point.outlier ? 1 : 0;
    const double x = exact.x + point.drift.x * point.age + options_.noise * noise_.normal();
    const double y = exact.y + point.drift.y * point.age + options_.noise * noise_.normal();
    (*world.features.features)[cell] = {static_cast<float>(x), static_cast<float>(y),
                                        seed ? frame + 1 : 0, seed ? 0.0f : 1.0f};
  }

  const track_world_options& options_;
  projector projector_;
  camera_path path_;
  random_stream lives_;
  random_stream noise_;
};

}  // namespace

track_world make_track_world(const track_world_options& options) {
  if (options.width - 1 <= 2 * kSeedInset || options.height - 1 <= 2 * kSeedInset) {
    throw std::invalid_argument("track_world: the frame is too small");
  }
  return generator(options).run();
}

}  // namespace synthetic
