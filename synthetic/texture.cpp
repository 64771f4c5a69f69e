#include "synthetic/texture.h"

#include <algorithm>
#include <bit>
#include <cmath>

#include "platform/tessel/threads.h"
#include "synthetic/random.h"

namespace synthetic {
namespace {

// In [0, 1), a function of a lattice point.
double lattice(int x, int y, std::uint32_t salt) {
  const std::uint64_t key = (static_cast<std::uint64_t>(static_cast<std::uint32_t>(x)) << 32) ^
                            (static_cast<std::uint64_t>(static_cast<std::uint32_t>(y)) << 8) ^
                            (static_cast<std::uint64_t>(salt) << 52) ^ salt;
  return static_cast<double>(mix(key) >> 11) * 0x1p-53;
}

double smooth(double t) {
  return t * t * (3 - 2 * t);
}

// Value noise with `period` lattice cells to a repeat, in [0, 1).
double value_noise(double u, double v, int period, std::uint32_t salt) {
  const double x = u * period;
  const double y = v * period;
  const int x0 = static_cast<int>(std::floor(x)) % period;
  const int y0 = static_cast<int>(std::floor(y)) % period;
  const int x1 = (x0 + 1) % period;
  const int y1 = (y0 + 1) % period;
  const double a = smooth(x - std::floor(x));
  const double b = smooth(y - std::floor(y));
  return (1 - b) * ((1 - a) * lattice(x0, y0, salt) + a * lattice(x1, y0, salt)) +
         b * ((1 - a) * lattice(x0, y1, salt) + a * lattice(x1, y1, salt));
}

// Octaves from `period` upward, each of half the amplitude; about -1 to 1.
double fractal(double u, double v, int period, int octaves, std::uint32_t salt) {
  double sum = 0.0;
  double amplitude = 1.0;
  for (int k = 0; k < octaves; ++k, period *= 2, amplitude *= 0.6) {
    sum += amplitude * (2 * value_noise(u, v, period, salt + static_cast<std::uint32_t>(k)) - 1);
  }
  return sum;
}

using rgb = std::array<double, 3>;

rgb blend(const rgb& a, const rgb& b, double t) {
  return {a[0] + t * (b[0] - a[0]), a[1] + t * (b[1] - a[1]), a[2] + t * (b[2] - a[2])};
}

rgb scaled(const rgb& a, double s) {
  return {a[0] * s, a[1] * s, a[2] * s};
}

// u across the street, a dashed line in the middle.
rgb road(double u, double v) {
  const double grain = fractal(u, v, 8, 7, 100);
  rgb c = scaled({92, 93, 98}, 1 + 0.16 * grain);
  if (fractal(u, v, 4, 3, 130) > 0.55) c = scaled(c, 0.78);             // mended patches
  if (std::abs(fractal(u, v, 6, 4, 140)) < 0.012) c = scaled(c, 0.55);  // cracks
  const double worn = 0.75 + 0.25 * fractal(u, v, 32, 3, 150);
  const bool dash = std::abs(u - 0.5) < 0.012 && v < 0.5;
  const bool edge = std::abs(u - 0.04) < 0.008 || std::abs(u - 0.96) < 0.008;
  return dash || edge ? blend(c, {225, 222, 205}, std::clamp(worn, 0.0, 1.0)) : c;
}

rgb paving(double u, double v) {
  constexpr int tiles = 8;
  const int row = static_cast<int>(v * tiles);
  const double shifted = u * tiles + 0.5 * (row % 2);
  const double x = shifted - std::floor(shifted);
  const double y = v * tiles - row;
  const double shade = 0.86 + 0.28 * lattice(static_cast<int>(shifted) % tiles, row, 200);
  const rgb c = scaled({168, 156, 142}, shade * (1 + 0.10 * fractal(u, v, 16, 6, 210)));
  const bool joint = x < 0.035 || x > 0.965 || y < 0.035 || y > 0.965;
  return joint ? scaled(c, 0.55) : c;
}

// Four windows by four storeys of a brick house.
rgb facade(double u, double v) {
  const double wx = u * 4;
  const double wy = v * 4;
  const int column = static_cast<int>(wx);
  const int storey = static_cast<int>(wy);
  const double x = wx - column;
  const double y = wy - storey;
  const double grime = 1 + 0.13 * fractal(u, v, 4, 7, 300);
  const double lit = lattice(column, storey, 310);
  if (x > 0.28 && x < 0.72 && y > 0.22 && y < 0.78) {
    const bool frame = x < 0.315 || x > 0.685 || y < 0.25 || y > 0.75 ||
                       std::abs(x - 0.5) < 0.014 || std::abs(y - 0.42) < 0.012;
    if (frame) return scaled({232, 228, 216}, grime);
    if (lit > 0.62 && (x < 0.41 || x > 0.59)) {  // curtains
      return scaled({214, 190, 150}, 0.85 + 0.15 * std::cos(x * 160));
    }
    return blend({38, 50, 66}, {120, 150, 178}, std::clamp((y - 0.25) * 1.2 * lit + 0.1, 0.0, 1.0));
  }
  if (x > 0.25 && x < 0.75 && y >= 0.78 && y < 0.815)
    return scaled({205, 200, 188}, grime);               // sill
  if (y > 0.965) return scaled({188, 180, 165}, grime);  // band
  const double brick_y = v * 128;
  const int course = static_cast<int>(brick_y);
  const double brick_x = u * 48 + 0.5 * (course % 2);
  const double fx = brick_x - std::floor(brick_x);
  const double fy = brick_y - course;
  if (fx < 0.07 || fy < 0.16) return scaled({176, 164, 150}, grime);
  const double tone = 0.78 + 0.36 * lattice(static_cast<int>(brick_x) % 48, course, 320);
  return scaled({186, 152, 132}, tone * grime);
}

rgb foliage(double u, double v) {
  const double leaves = fractal(u, v, 8, 7, 400);
  return blend({28, 62, 24}, {128, 166, 62}, std::clamp(0.5 + 0.55 * leaves, 0.0, 1.0));
}

rgb grass(double u, double v) {
  const double blades = fractal(u, v, 6, 8, 500);
  return blend({62, 92, 38}, {150, 170, 84}, std::clamp(0.5 + 0.45 * blades, 0.0, 1.0));
}

// Discs and bars of many colours: a billboard.
rgb panel(double u, double v) {
  rgb c = blend({236, 226, 200}, {222, 204, 170}, value_noise(u, v, 4, 600));
  const auto ink = [](int k, std::uint32_t salt) {
    return rgb{40 + 200 * lattice(k, 0, salt), 40 + 170 * lattice(k, 1, salt),
               50 + 170 * lattice(k, 2, salt)};
  };
  for (int k = 0; k < 28; ++k) {
    const double dx = u - lattice(k, 3, 610);
    const double dy = v - lattice(k, 4, 610);
    const double size = 0.03 + 0.10 * lattice(k, 5, 610);
    const bool disc = k % 2 == 0 && dx * dx + dy * dy < size * size;
    const bool bar = k % 2 == 1 && std::abs(dx) < 1.4 * size && std::abs(dy) < 0.35 * size;
    if (disc || bar) c = ink(k, 620);
  }
  const bool rim = u < 0.025 || u > 0.975 || v < 0.03 || v > 0.97;
  if (rim) c = {70, 62, 58};
  return scaled(c, 1 + 0.07 * fractal(u, v, 32, 5, 630));
}

rgb sky(double u, double v) {
  const rgb blue = blend({86, 140, 208}, {150, 188, 226}, 0.5 + 0.5 * std::cos(2 * M_PI * v));
  const double cloud = fractal(u, v, 3, 7, 700);
  return blend(blue, {246, 247, 250}, smooth(std::clamp(0.5 + 1.1 * cloud, 0.0, 1.0)));
}

rgb texel(material what, double u, double v) {
  switch (what) {
    case material::road:
      return road(u, v);
    case material::paving:
      return paving(u, v);
    case material::facade:
      return facade(u, v);
    case material::foliage:
      return foliage(u, v);
    case material::grass:
      return grass(u, v);
    case material::panel:
      return panel(u, v);
    case material::sky:
      break;
  }
  return sky(u, v);
}

// A position as a fraction of a repeat, in 1/2^32: it wraps by itself.
std::uint32_t wrapped(double u) {
  return static_cast<std::uint32_t>(static_cast<std::int64_t>(u * 0x1p32));
}

// One axis at a level of 2^log_side texels.
struct axis {
  std::uint32_t first;
  std::uint32_t second;
  std::uint32_t fraction;  // of the way to the second, in 1/256
};

axis at_level(std::uint32_t u, int log_side) {
  // Texel centres lie at halves.
  const std::uint64_t half = std::uint64_t{1} << (31 - log_side);
  const std::uint64_t x =
      std::uint64_t{static_cast<std::uint32_t>(u - static_cast<std::uint32_t>(half))} << 8;
  const auto fixed = static_cast<std::uint32_t>(x >> (32 - log_side));
  const std::uint32_t mask = (1u << log_side) - 1;
  return {fixed >> 8, ((fixed >> 8) + 1) & mask, fixed & 255};
}

// Lanes of 256 times the colour. The weights add up to 256, so no lane runs into the next.
std::uint64_t bilinear(const std::vector<std::uint64_t>& texels, int log_side, std::uint32_t u,
                       std::uint32_t v) {
  const axis x = at_level(u, log_side);
  const axis y = at_level(v, log_side);
  const std::uint64_t* top = texels.data() + (std::size_t{y.first} << log_side);
  const std::uint64_t* bottom = texels.data() + (std::size_t{y.second} << log_side);
  const std::uint64_t both = (x.fraction * y.fraction + 128) >> 8;
  return top[x.first] * (256 - x.fraction - y.fraction + both) +
         top[x.second] * (x.fraction - both) + bottom[x.first] * (y.fraction - both) +
         bottom[x.second] * both;
}

// A sum of such lanes.
struct lane_sum {
  std::uint64_t red_blue = 0;  // 32 bits each
  std::uint64_t green = 0;

  void add(std::uint64_t lanes) {
    red_blue += lanes & 0x0000FFFF0000FFFF;
    green += lanes >> 16 & 0xFFFF;
  }
  void add_to(colour& c, float weight) const {
    c[0] += weight * static_cast<float>(static_cast<std::uint32_t>(red_blue));
    c[1] += weight * static_cast<float>(static_cast<std::uint32_t>(green));
    c[2] += weight * static_cast<float>(static_cast<std::uint32_t>(red_blue >> 32));
  }
};

}  // namespace

texture::texture(material what, int side) : side_(side) {
  const auto n = static_cast<std::size_t>(side);
  levels_.emplace_back(n * n);
  tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
      [&](std::size_t y) {
        for (std::size_t x = 0; x < n; ++x) {
          const rgb c = texel(what, (static_cast<double>(x) + 0.5) / side,
                              (static_cast<double>(y) + 0.5) / side);
          std::uint64_t lanes = 0;
          for (std::size_t k = 0; k < 3; ++k) {
            lanes |= static_cast<std::uint64_t>(std::clamp(c[k] + 0.5, 0.0, 255.0)) << (16 * k);
          }
          levels_[0][y * n + x] = lanes;
        }
      },
      n);
  for (std::size_t m = n / 2; m > 0; m /= 2) {
    const texels& finer = levels_.back();
    texels coarser(m * m);
    for (std::size_t y = 0; y < m; ++y) {
      for (std::size_t x = 0; x < m; ++x) {
        const std::uint64_t* p = finer.data() + 4 * y * m + 2 * x;
        const std::uint64_t sum = p[0] + p[1] + p[2 * m] + p[2 * m + 1] + 0x0002000200020002;
        coarser[y * m + x] = sum >> 2 & 0x00FF00FF00FF00FF;
      }
    }
    levels_.push_back(std::move(coarser));
  }
}

colour texture::sample(double u, double v, double du_dx, double dv_dx, double du_dy,
                       double dv_dy) const {
  double longer = std::sqrt(du_dx * du_dx + dv_dx * dv_dx);
  double shorter = std::sqrt(du_dy * du_dy + dv_dy * dv_dy);
  double du = du_dx;
  double dv = dv_dx;
  if (longer < shorter) {
    std::swap(longer, shorter);
    du = du_dy;
    dv = dv_dy;
  }
  int taps = 1;
  while (taps < 8 && taps * shorter < longer) ++taps;
  const int top = static_cast<int>(levels_.size()) - 1;
  const double share = 1.0 / taps;
  const double width = std::clamp(std::max(longer * share, shorter) * side_, 1.0,
                                  static_cast<double>(side_));  // texels
  // The logarithm: its whole part, and what is left by a straight line.
  const auto bits = std::bit_cast<std::uint64_t>(width);
  const int level = static_cast<int>(bits >> 52) - 1023;
  const auto between = static_cast<float>(bits >> 44 & 255) / 256;

  const std::uint32_t step_u = wrapped(share * du);
  const std::uint32_t step_v = wrapped(share * dv);
  const double back = 0.5 * share - 0.5;
  std::uint32_t at_u = wrapped(u + back * du);
  std::uint32_t at_v = wrapped(v + back * dv);
  const texels& fine = levels_[static_cast<std::size_t>(level)];
  const texels& coarse = levels_[static_cast<std::size_t>(std::min(level + 1, top))];
  lane_sum fine_sum;
  lane_sum coarse_sum;
  for (int i = 0; i < taps; ++i, at_u += step_u, at_v += step_v) {
    fine_sum.add(bilinear(fine, top - level, at_u, at_v));
    if (between > 0) coarse_sum.add(bilinear(coarse, top - level - 1, at_u, at_v));
  }
  const float scale = static_cast<float>(share / 256);
  colour sum = {0, 0, 0};
  fine_sum.add_to(sum, (1 - between) * scale);
  coarse_sum.add_to(sum, between * scale);
  return sum;
}

const texture& texture_of(material what) {
  constexpr int side = 1024;
  static const std::array<texture, kMaterialCount> all = {
      texture(material::road, side),   texture(material::paving, side),
      texture(material::facade, side), texture(material::foliage, side),
      texture(material::grass, side),  texture(material::panel, side),
      texture(material::sky, side)};
  return all[static_cast<std::size_t>(what)];
}

}  // namespace synthetic
