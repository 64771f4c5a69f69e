#include "synthetic/scene.h"

#include <algorithm>
#include <cmath>
#include <utility>

#include "platform/tessel/threads.h"
#include "synthetic/random.h"

namespace synthetic {
namespace {

constexpr double kNear = 0.05;  // metres; nothing nearer is drawn
constexpr colour kHaze = {196, 212, 228};
constexpr int kStripRows = 16;
// Pixels that a texture sample is smoothed over: a lens's blur, without which finer detail than
// pixels would alias and things would seem to lie elsewhere than they do.
constexpr double kBlur = 1.5;

double dot(const vector3& a, const vector3& b) {
  return a[0] * b[0] + a[1] * b[1] + a[2] * b[2];
}

vector3 cross(const vector3& a, const vector3& b) {
  return {a[1] * b[2] - a[2] * b[1], a[2] * b[0] - a[0] * b[2], a[0] * b[1] - a[1] * b[0]};
}

vector3 minus(const vector3& a, const vector3& b) {
  return {a[0] - b[0], a[1] - b[1], a[2] - b[2]};
}

// A number that is linear in the pixel.
struct linear {
  double constant;
  double per_x;
  double per_y;
  double at(double x, double y) const { return constant + per_x * x + per_y * y; }
};

// A surface under one pose, by homogeneous coordinates: at a pixel, across = a / d, along = b / d
// in metres and d = 1 / depth, which may be negative.
struct projected {
  linear a;
  linear b;
  linear d;
};

projected project_surface(const surface& s, const pinhole& camera, const camera_pose& pose) {
  const rotation3 r = rotation_matrix(pose.rotation);
  // World direction of the ray with camera depth 1, as three linear functions.
  const double px = 1.0 / camera.focal;
  std::array<linear, 3> ray;
  for (std::size_t k = 0; k < 3; ++k) {
    ray[k] = {r[6 + k] - px * (r[k] * camera.centre_x + r[3 + k] * camera.centre_y), px * r[k],
              px * r[3 + k]};
  }
  const auto along_ray = [&ray](const vector3& v) {
    linear sum = {0, 0, 0};
    for (std::size_t k = 0; k < 3; ++k) {
      sum.constant += v[k] * ray[k].constant;
      sum.per_x += v[k] * ray[k].per_x;
      sum.per_y += v[k] * ray[k].per_y;
    }
    return sum;
  };
  const vector3 normal = cross(s.across, s.along);
  const vector3 to_camera = minus(pose.centre, s.origin);
  const double height = -dot(normal, to_camera);  // depth = height / (normal . ray)
  if (std::abs(height) < 1e-9) return {{0, 0, 0}, {0, 0, 0}, {-1, 0, 0}};  // seen edge-on
  const linear n = along_ray(normal);
  const auto coordinate = [&](const vector3& axis) {
    const linear l = along_ray(axis);
    const double start = dot(axis, to_camera) / height;
    return linear{l.constant + start * n.constant, l.per_x + start * n.per_x,
                  l.per_y + start * n.per_y};
  };
  return {coordinate(s.across),
          coordinate(s.along),
          {n.constant / height, n.per_x / height, n.per_y / height}};
}

bool inside(const surface& s, double across, double along) {
  if (!(across >= 0 && across <= s.width && along >= 0 && along <= s.height)) return false;
  if (!s.oval) return true;
  const double x = 2 * across / s.width - 1;
  const double y = 2 * along / s.height - 1;
  return x * x + y * y <= 1;
}

// The rectangle of pixels outside which a surface cannot be seen; empty where it is behind.
struct box {
  double left, top, right, bottom;
};

box bounds_of(const surface& s, const pinhole& camera, const camera_pose& pose) {
  std::array<vector3, 4> corners;
  for (std::size_t k = 0; k < 4; ++k) {
    const double a = k == 1 || k == 2 ? s.width : 0.0;
    const double b = k >= 2 ? s.height : 0.0;
    vector3 world;
    for (std::size_t i = 0; i < 3; ++i) world[i] = s.origin[i] + a * s.across[i] + b * s.along[i];
    corners[k] = camera_from_world(pose, world);
  }
  box bounds = {1e30, 1e30, -1e30, -1e30};
  const auto add = [&](const vector3& p) {
    const double x = camera.focal * p[0] / p[2] + camera.centre_x;
    const double y = camera.focal * p[1] / p[2] + camera.centre_y;
    bounds = {std::min(bounds.left, x), std::min(bounds.top, y), std::max(bounds.right, x),
              std::max(bounds.bottom, y)};
  };
  for (std::size_t k = 0; k < 4; ++k) {  // the outline, cut at the near plane
    const vector3& p = corners[k];
    const vector3& q = corners[(k + 1) % 4];
    if (p[2] >= kNear) add(p);
    if ((p[2] >= kNear) == (q[2] >= kNear)) continue;
    const double t = (kNear - p[2]) / (q[2] - p[2]);
    add({p[0] + t * (q[0] - p[0]), p[1] + t * (q[1] - p[1]), kNear});
  }
  return bounds;
}

struct candidate {
  int index;
  const surface* source;
  box bounds;
  projected view;
  const texture* skin;
  double repeats_across;  // a metre
  double repeats_along;
};

// What is seen at a place, or null.
const candidate* nearest(const std::vector<const candidate*>& candidates, double x, double y) {
  const candidate* best = nullptr;
  double best_d = 0.0;
  for (const candidate* c : candidates) {
    const double d = c->view.d.at(x, y);
    if (!(d > best_d && d < 1.0 / kNear)) continue;
    const double w = 1.0 / d;
    if (!inside(*c->source, c->view.a.at(x, y) * w, c->view.b.at(x, y) * w)) continue;
    best = c;
    best_d = d;
  }
  return best;
}

// The colour of a surface at a pixel.
colour shade(const candidate& c, double x, double y, double haze) {
  const projected& v = c.view;
  const surface& s = *c.source;
  const double w = 1.0 / v.d.at(x, y);
  const double across = v.a.at(x, y) * w;
  const double along = v.b.at(x, y) * w;
  const double ku = kBlur * w * c.repeats_across;
  const double kv = kBlur * w * c.repeats_along;
  colour out =
      c.skin->sample(across * c.repeats_across, along * c.repeats_along,
                     (v.a.per_x - across * v.d.per_x) * ku, (v.b.per_x - along * v.d.per_x) * kv,
                     (v.a.per_y - across * v.d.per_y) * ku, (v.b.per_y - along * v.d.per_y) * kv);
  const bool fades = s.what != material::sky;
  const auto clear = fades ? static_cast<float>(std::exp(-w / haze)) : 1.0f;
  for (std::size_t k = 0; k < 3; ++k) {
    out[k] = clear * s.tint[k] * out[k] + (1 - clear) * kHaze[k];
  }
  return out;
}

// The colour of a pixel that several surfaces share: each has its colour in the middle of what is
// seen of it, and the weight of how much that is.
colour shade_outline(const std::vector<const candidate*>& candidates, double x, double y,
                     double haze) {
  constexpr int side = 4;
  struct part {
    const candidate* what;
    int count;
    double x, y;  // sums
  };
  std::array<part, side * side> parts;
  std::size_t n = 0;
  for (int s = 0; s < side * side; ++s) {
    const double sx = x + (s % side + 0.5) / side - 0.5;
    const double sy = y + (s / side + 0.5) / side - 0.5;
    const candidate* what = nearest(candidates, sx, sy);
    std::size_t k = 0;
    while (k < n && parts[k].what != what) ++k;
    if (k == n) parts[n++] = {what, 0, 0, 0};
    parts[k] = {what, parts[k].count + 1, parts[k].x + sx, parts[k].y + sy};
  }
  colour sum = {0, 0, 0};
  for (std::size_t k = 0; k < n; ++k) {
    const part& p = parts[k];
    // What is seen of a convex surface need not hold its middle, but the surface does.
    const colour c = p.what ? shade(*p.what, p.x / p.count, p.y / p.count, haze) : kHaze;
    const float weight = static_cast<float>(p.count) / (side * side);
    for (std::size_t j = 0; j < 3; ++j) sum[j] += weight * c[j];
  }
  return sum;
}

surface upright(double x, double z, double bottom, double width, double height, material what,
                double repeat) {
  return {{x, -bottom - height, z}, {1, 0, 0}, {0, 1, 0}, width, height, what, repeat, repeat};
}

}  // namespace

struct scene::hit {
  int surface;
  vector3 world;
  double depth;
};

std::vector<surface> street(std::uint64_t seed) {
  // One draw a statement: compilers evaluate a call's arguments in orders of their own.
  random_stream random(seed);
  std::vector<surface> all;
  constexpr double end = 400.0;
  constexpr double behind = -20.0;
  const auto floor = [&](double x, double y, double width, material what, double repeat) {
    all.push_back(
        {{x, y, behind}, {1, 0, 0}, {0, 0, 1}, width, end - behind, what, repeat, repeat});
  };
  floor(-3.5, 0, 7, material::road, 7);
  floor(-6.5, -0.12, 3, material::paving, 3);
  floor(3.5, -0.12, 3, material::paving, 3);
  floor(-500, 0.02, 493.5, material::grass, 9);
  floor(6.5, 0.02, 493.5, material::grass, 9);
  for (const double x : {-3.5, 3.5}) {  // kerbs
    all.push_back({{x, -0.12, behind},
                   {0, 0, 1},
                   {0, 1, 0},
                   end - behind,
                   0.12,
                   material::paving,
                   3,
                   3,
                   {0.7f, 0.7f, 0.7f}});
  }
  for (const int side : {-1, 1}) {
    double z = -12 + 5 * random.uniform();
    while (z < 150) {
      const double length = random.uniform(9, 17);
      const double tall = 3.4 * std::floor(random.uniform(2, 5.5));
      const double front = side * random.uniform(7.5, 10.5);
      const double tone = random.uniform(0.75, 1.1);
      const colour tint = {static_cast<float>(tone * random.uniform(0.9, 1.1)),
                           static_cast<float>(tone * random.uniform(0.85, 1.08)),
                           static_cast<float>(tone * random.uniform(0.8, 1.1))};
      const colour shadow = {0.72f * tint[0], 0.72f * tint[1], 0.76f * tint[2]};
      all.push_back({{front, -tall, z},
                     {0, 0, 1},
                     {0, 1, 0},
                     length,
                     tall,
                     material::facade,
                     13.6,
                     13.6,
                     tint});
      surface gable =
          upright(side < 0 ? front - 14 : front, z, 0, 14, tall, material::facade, 13.6);
      gable.tint = shadow;
      all.push_back(gable);
      z += length + (random.uniform() < 0.4 ? random.uniform(2, 7) : 0.0);
    }
    for (double tree = random.uniform(5, 11); tree < 120; tree += random.uniform(9, 16)) {
      const double x = side * random.uniform(5.4, 6.2);
      const double crown = random.uniform(2.2, 3.6);
      surface trunk = upright(x - 0.13, tree, 0, 0.26, 2.6, material::foliage, 1.5);
      trunk.tint = {0.95f, 0.62f, 0.6f};
      all.push_back(trunk);
      for (int k = 0; k < 3; ++k) {
        const double aside = random.uniform(-0.5, 0.5);
        const double back = random.uniform(-0.6, 0.6);
        surface leaves = upright(x - crown / 2 + aside, tree + back, 2.0 + 0.5 * k, crown,
                                 0.8 * crown, material::foliage, 3.0);
        leaves.oval = true;
        const auto light = static_cast<float>(0.75 + 0.18 * k);
        leaves.tint = {light, light, light};
        all.push_back(leaves);
      }
    }
    for (double sign = random.uniform(7, 12); sign < 90; sign += random.uniform(14, 24)) {
      const double x = side * random.uniform(4.0, 5.0);
      surface pole = upright(x - 0.04, sign, 0, 0.08, 2.4, material::paving, 1);
      pole.tint = {0.45f, 0.47f, 0.5f};
      all.push_back(pole);
      all.push_back(upright(x - 0.7, sign - 0.03, 1.9, 1.4, 1.0, material::panel, 1.4));
    }
  }
  for (double x = -160; x < 160;) {  // the skyline
    const double wide = random.uniform(12, 30);
    const double away = random.uniform(210, 330);
    const double tall = random.uniform(14, 52);
    all.push_back(upright(x, away, 0, wide, tall, material::facade, 20));
    x += wide * random.uniform(0.7, 1.2);
  }
  all.push_back(
      {{-9000, -6000, 4000}, {1, 0, 0}, {0, 1, 0}, 18000, 9000, material::sky, 7000, 6000});
  return all;
}

std::vector<surface> wall(double distance) {
  return {{{-50 * distance, -50 * distance, distance},
           {1, 0, 0},
           {0, 1, 0},
           100 * distance,
           100 * distance,
           material::panel,
           0.8 * distance,
           0.8 * distance}};
}

scene::scene(std::vector<surface> surfaces, camera_path path, const scene_options& options)
    : surfaces_(std::move(surfaces)),
      path_(std::move(path)),
      options_(options),
      camera_(centred_pinhole(options.width, options.height, options.field_of_view)) {}

double scene::row_time(int frame, double y) const {
  if (options_.height < 2) return frame;
  return frame + options_.readout * y / (options_.height - 1);
}

// The world at one instant; the occluder, where there is one, comes last.
std::vector<surface> scene::surfaces_at(double time) const {
  std::vector<surface> all = surfaces_;
  if (!options_.occluder) return all;
  constexpr double ahead = 4.0;
  constexpr double length = 2.2;
  const double reach = ahead * std::tan(0.5 * options_.field_of_view) + length;
  const camera_pose pose = path_.intended(time);
  const double x = pose.centre[0] - reach - 0.5 * length +
                   2 * reach * time / std::max(options_.frame_count, 1) +
                   ahead * std::tan(-pose.rotation[1]);
  surface board =
      upright(x, pose.centre[2] + ahead, -pose.centre[1] - 1.1, length, 1.7, material::panel, 2.2);
  board.repeat_along = 1.7;
  all.push_back(board);
  return all;
}

void scene::draw_rows(int frame, double shift, int first, int end, HX_Pixel8* pixels,
                      std::size_t row_pixels) const {
  const int width = options_.width;
  // Which surfaces these rows may show. A bound is taken at both ends of the strip's time, with
  // room for what the camera does between.
  const double early = row_time(frame, first - 1) + shift;
  const double late = row_time(frame, end) + shift;
  const std::vector<surface> world = surfaces_at(early);
  const std::vector<surface> later = options_.readout == 0 ? world : surfaces_at(late);
  std::vector<candidate> strip;
  for (std::size_t k = 0; k < world.size(); ++k) {
    box b = bounds_of(world[k], camera_, path_.shaken(early));
    if (options_.readout != 0) {
      const box c = bounds_of(later[k], camera_, path_.shaken(late));
      b = {std::min(b.left, c.left) - 4, std::min(b.top, c.top) - 4, std::max(b.right, c.right) + 4,
           std::max(b.bottom, c.bottom) + 4};
    }
    if (b.right < -2 || b.left > width + 1 || b.bottom < first - 3 || b.top > end + 2) continue;
    strip.push_back({static_cast<int>(k),
                     &world[k],
                     b,
                     {},
                     &texture_of(world[k].what),
                     1.0 / world[k].repeat_across,
                     1.0 / world[k].repeat_along});
  }

  random_stream frame_random(substream(options_.seed, 2 * static_cast<std::uint64_t>(frame)));
  const bool changed = frame > 0;
  const auto gain =
      static_cast<float>(1 + (changed ? options_.gain * frame_random.uniform(-1, 1) : 0));
  const auto bias = static_cast<float>(changed ? options_.bias * frame_random.uniform(-1, 1) : 0);

  const auto set_row = [&](double y) {
    const double t = row_time(frame, y) + shift;
    const camera_pose pose = path_.shaken(t);
    if (options_.occluder && options_.readout != 0) {
      const std::vector<surface> now = surfaces_at(t);
      for (candidate& c : strip)
        c.view = project_surface(now[static_cast<std::size_t>(c.index)], camera_, pose);
    } else {
      for (candidate& c : strip) c.view = project_surface(*c.source, camera_, pose);
    }
  };

  // For each row: what its pixels' centres show, by comparing one surface's whole span at a time.
  const auto columns = static_cast<std::size_t>(width);
  std::vector<double> depths(columns);
  const auto identify = [&](int y, std::vector<int>& ids) {
    set_row(y);
    std::fill(ids.begin(), ids.end(), -1);
    std::fill(depths.begin(), depths.end(), 0.0);
    for (std::size_t k = 0; k < strip.size(); ++k) {
      const candidate& c = strip[k];
      if (y < c.bounds.top - 2 || y > c.bounds.bottom + 2) continue;
      const int x0 = static_cast<int>(std::clamp(c.bounds.left - 1, 0.0, 1.0 * width));
      const int x1 = static_cast<int>(std::clamp(c.bounds.right + 2, 0.0, 1.0 * width));
      for (int x = x0; x < x1; ++x) {
        const auto i = static_cast<std::size_t>(x);
        const double d = c.view.d.at(x, y);
        if (!(d > depths[i] && d < 1.0 / kNear)) continue;
        const double w = 1.0 / d;
        if (!inside(*c.source, c.view.a.at(x, y) * w, c.view.b.at(x, y) * w)) continue;
        depths[i] = d;
        ids[i] = static_cast<int>(k);
      }
    }
  };

  std::vector<int> above(columns), here(columns), below(columns);
  std::vector<const candidate*> about;  // a pixel
  identify(first - 1, above);
  identify(first, here);
  for (int y = first; y < end; ++y) {
    identify(y + 1, below);
    set_row(y);
    random_stream noise(substream(options_.seed + 1, (static_cast<std::uint64_t>(frame) << 20) +
                                                         static_cast<std::uint64_t>(y)));
    HX_Pixel8* out = pixels + static_cast<std::size_t>(y) * row_pixels;
    for (std::size_t i = 0; i < columns; ++i) {
      const int id = here[i];
      const auto x = static_cast<double>(i);
      const bool plain = above[i] == id && below[i] == id && (i == 0 || here[i - 1] == id) &&
                         (i + 1 == columns || here[i + 1] == id);
      colour c = kHaze;
      if (!plain) {
        about.clear();
        for (const candidate& k : strip) {
          const box& b = k.bounds;
          if (x < b.left - 2 || x > b.right + 2 || y < b.top - 2 || y > b.bottom + 2) continue;
          about.push_back(&k);
        }
        c = shade_outline(about, x, y, options_.haze);
      } else if (id >= 0) {
        c = shade(strip[static_cast<std::size_t>(id)], x, y, options_.haze);
      }
      std::array<std::uint8_t, 3> bytes;
      for (std::size_t j = 0; j < 3; ++j) {
        float value = gain * c[j] + bias;
        if (options_.noise > 0) value += static_cast<float>(options_.noise * noise.normal());
        bytes[j] = static_cast<std::uint8_t>(std::clamp(value + 0.5f, 0.0f, 255.0f));
      }
      out[i] = {255, bytes[0], bytes[1], bytes[2]};
    }
    above.swap(here);
    here.swap(below);
  }
}

// The mean of instants spread evenly over the time that the shutter is open.
void scene::expose_rows(int frame, int first, int end, HX_Pixel8* pixels,
                        std::size_t row_pixels) const {
  const double open = options_.exposure ? options_.exposure(frame) : 0.0;
  if (!(open > 0)) return draw_rows(frame, 0.0, first, end, pixels, row_pixels);
  constexpr int instants = 24;
  const auto columns = static_cast<std::size_t>(options_.width);
  std::vector<std::array<int, 3>> sums(columns * static_cast<std::size_t>(end - first));
  const auto at = [&](std::size_t i) -> HX_Pixel8& {
    return pixels[(static_cast<std::size_t>(first) + i / columns) * row_pixels + i % columns];
  };
  for (int k = 0; k < instants; ++k) {
    draw_rows(frame, open * ((k + 0.5) / instants - 0.5), first, end, pixels, row_pixels);
    for (std::size_t i = 0; i < sums.size(); ++i) {
      const HX_Pixel8& p = at(i);
      sums[i] = {sums[i][0] + p.red, sums[i][1] + p.green, sums[i][2] + p.blue};
    }
  }
  const auto mean = [](int sum) {
    return static_cast<std::uint8_t>((sum + instants / 2) / instants);
  };
  for (std::size_t i = 0; i < sums.size(); ++i) {
    at(i) = {255, mean(sums[i][0]), mean(sums[i][1]), mean(sums[i][2])};
  }
}

void scene::render(int frame, HX_Pixel8* pixels, std::size_t row_pixels) const {
  const int strips = (options_.height + kStripRows - 1) / kStripRows;
  texture_of(material::road);  // made before the rows need it, not by the first of them
  tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
      [&](std::size_t strip) {
        const int first = static_cast<int>(strip) * kStripRows;
        expose_rows(frame, first, std::min(first + kStripRows, options_.height), pixels,
                    row_pixels);
      },
      static_cast<std::size_t>(strips));
}

std::vector<HX_Pixel8> scene::render(int frame) const {
  const auto width = static_cast<std::size_t>(options_.width);
  std::vector<HX_Pixel8> pixels(width * static_cast<std::size_t>(options_.height));
  render(frame, pixels.data(), width);
  return pixels;
}

std::optional<scene::hit> scene::cast(int frame, point2 pixel) const {
  const double t = row_time(frame, pixel.y);
  const camera_pose pose = path_.shaken(t);
  const std::vector<surface> world = surfaces_at(t);
  std::optional<hit> best;
  for (std::size_t k = 0; k < world.size(); ++k) {
    const projected view = project_surface(world[k], camera_, pose);
    const double d = view.d.at(pixel.x, pixel.y);
    if (!(d > 0 && d < 1.0 / kNear) || (best && d * best->depth <= 1.0)) continue;
    if (!inside(world[k], view.a.at(pixel.x, pixel.y) / d, view.b.at(pixel.x, pixel.y) / d))
      continue;
    best = hit{static_cast<int>(k), world_from_pixel(camera_, pose, pixel, 1.0 / d), 1.0 / d};
  }
  return best;
}

std::optional<point2> scene::project(const std::function<camera_pose(double)>& path, int frame,
                                     const vector3& world) const {
  std::optional<point2> pixel =
      pixel_from_world(camera_, path(row_time(frame, camera_.centre_y)), world);
  // Each row has its own time: a contraction, as the picture moves by far less than its height
  // while it is read.
  for (int k = 0; k < 50 && pixel && options_.readout != 0; ++k) {
    const double y = pixel->y;
    pixel = pixel_from_world(camera_, path(row_time(frame, y)), world);
    if (pixel && std::abs(pixel->y - y) < 1e-10) break;
  }
  const bool in_frame = pixel && pixel->x >= -0.5 && pixel->x <= options_.width - 0.5 &&
                        pixel->y >= -0.5 && pixel->y <= options_.height - 0.5;
  return in_frame ? pixel : std::nullopt;
}

std::optional<point2> scene::locate(int from, point2 pixel, int to) const {
  const std::optional<hit> seen = cast(from, pixel);
  if (!seen || seen->surface >= static_cast<int>(surfaces_.size())) return std::nullopt;
  const std::optional<point2> place = project(path_.shaken, to, seen->world);
  if (!place) return std::nullopt;
  const std::optional<hit> there = cast(to, *place);
  const bool same = there && there->surface == seen->surface;
  return same ? place : std::nullopt;
}

std::optional<point2> scene::locate_intended(int from, point2 pixel, int to) const {
  const std::optional<hit> seen = cast(from, pixel);
  if (!seen || seen->surface >= static_cast<int>(surfaces_.size())) return std::nullopt;
  return project(path_.intended, to, seen->world);
}

std::optional<double> scene::depth(int frame, point2 pixel) const {
  const std::optional<hit> seen = cast(frame, pixel);
  return seen ? std::optional<double>(seen->depth) : std::nullopt;
}

}  // namespace synthetic
