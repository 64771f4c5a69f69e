#include "synthetic/texture.h"

#include <algorithm>
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

}  // namespace

texture::texture(material what, int side) : side_(side) {
  const auto n = static_cast<std::size_t>(side);
  levels_.emplace_back(n * n);
  tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
      [&](std::size_t y) {
        for (std::size_t x = 0; x < n; ++x) {
          const rgb c = texel(what, (static_cast<double>(x) + 0.5) / side,
                              (static_cast<double>(y) + 0.5) / side);
          for (std::size_t k = 0; k < 3; ++k) {
            levels_[0][y * n + x][k] =
                static_cast<std::uint8_t>(std::clamp(c[k] + 0.5, 0.0, 255.0));
          }
        }
      },
      n);
  for (std::size_t m = n / 2; m > 0; m /= 2) {
    const auto& finer = levels_.back();
    std::vector<std::array<std::uint8_t, 4>> coarser(m * m);
    for (std::size_t y = 0; y < m; ++y) {
      for (std::size_t x = 0; x < m; ++x) {
        for (std::size_t k = 0; k < 3; ++k) {
          const std::size_t i = 4 * y * m + 2 * x;
          coarser[y * m + x][k] = static_cast<std::uint8_t>(
              (finer[i][k] + finer[i + 1][k] + finer[i + 2 * m][k] + finer[i + 2 * m + 1][k] + 2) /
              4);
        }
      }
    }
    levels_.push_back(std::move(coarser));
  }
}

colour texture::bilinear(int level, double u, double v) const {
  const auto& texels = levels_[static_cast<std::size_t>(level)];
  const int n = side_ >> level;
  const double x = u * n - 0.5;
  const double y = v * n - 0.5;
  const double fx = std::floor(x);
  const double fy = std::floor(y);
  const auto a = static_cast<float>(x - fx);
  const auto b = static_cast<float>(y - fy);
  const int mask = n - 1;
  const int x0 = static_cast<int>(fx) & mask;
  const int x1 = (x0 + 1) & mask;
  const int y0 = (static_cast<int>(fy) & mask) * n;
  const int y1 = ((static_cast<int>(fy) + 1) & mask) * n;
  const auto& p = texels[static_cast<std::size_t>(y0 + x0)];
  const auto& q = texels[static_cast<std::size_t>(y0 + x1)];
  const auto& r = texels[static_cast<std::size_t>(y1 + x0)];
  const auto& s = texels[static_cast<std::size_t>(y1 + x1)];
  colour c;
  for (std::size_t k = 0; k < 3; ++k) {
    c[k] = (1 - b) * ((1 - a) * p[k] + a * q[k]) + b * ((1 - a) * r[k] + a * s[k]);
  }
  return c;
}

colour texture::sample(double u, double v, double du_dx, double dv_dx, double du_dy,
                       double dv_dy) const {
  double longer = std::hypot(du_dx, dv_dx);
  double shorter = std::hypot(du_dy, dv_dy);
  double du = du_dx;
  double dv = dv_dx;
  if (longer < shorter) {
    std::swap(longer, shorter);
    du = du_dy;
    dv = dv_dy;
  }
  const int taps = std::clamp(static_cast<int>(std::ceil(longer / std::max(shorter, 1e-12))), 1, 8);
  const double width = std::max(longer / taps, shorter) * side_;  // texels
  const int top = static_cast<int>(levels_.size()) - 1;
  const double lod = std::clamp(std::log2(std::max(width, 1e-12)), 0.0, static_cast<double>(top));
  const int level = std::min(static_cast<int>(lod), top);
  const auto between = static_cast<float>(lod - level);
  colour sum = {0, 0, 0};
  for (int i = 0; i < taps; ++i) {
    const double along = (i + 0.5) / taps - 0.5;
    const colour fine = bilinear(level, u + along * du, v + along * dv);
    if (between == 0.0f) {
      for (std::size_t k = 0; k < 3; ++k) sum[k] += fine[k];
      continue;
    }
    const colour coarse = bilinear(level + 1, u + along * du, v + along * dv);
    for (std::size_t k = 0; k < 3; ++k) sum[k] += (1 - between) * fine[k] + between * coarse[k];
  }
  for (float& c : sum) c /= static_cast<float>(taps);
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
