#pragma once

#include <array>
#include <cstdint>
#include <vector>

namespace synthetic {

using colour = std::array<float, 3>;  // red, green, blue, 0 to 255

enum class material { road, paving, facade, foliage, grass, panel, sky };
inline constexpr int kMaterialCount = 7;

// A square colour image that repeats in both directions, with its halved copies (mip map; Williams,
// Pyramidal Parametrics, 1983).
class texture {
 public:
  // side: a power of two, in texels. The same arguments give the same texels everywhere.
  texture(material what, int side);

  int side() const { return side_; }

  // The texture at (u, v), in repeats, smoothed over a parallelogram of one pixel: (du_dx, dv_dx)
  // and (du_dy, dv_dy) are the pixel's sides. Up to 8 trilinear samples along the longer side,
  // in fixed point: positions to 1/256 texel, weights to 1/256. |u| and |v| below 2^31.
  colour sample(double u, double v, double du_dx, double dv_dx, double du_dy, double dv_dy) const;

 private:
  // Four 16-bit lanes: red, green, blue from the lowest up, each 0 to 255.
  using texels = std::vector<std::uint64_t>;

  int side_;
  std::vector<texels> levels_;  // each of half the side of the one before, down to 1
};

// The texture of a material, made at the first call; safe from several threads.
const texture& texture_of(material what);

}  // namespace synthetic
