#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <vector>

#include "host/pixels/pixel_rows.h"
#include "host/pixels/world_buffer.h"
#include "host/pixels/world_operations.h"

namespace calmframe::host {
namespace {

// Weights of the pixels at distance 0, 1, ..., of sum 1 over both sides; up to 3 sigma, behind
// which lie 0.3 %.
std::vector<float> HalfKernel(double sigma) {
  std::vector<double> weights;
  double sum = 0;
  for (int i = 0; i <= static_cast<int>(std::ceil(3 * sigma)); ++i) {
    weights.push_back(std::exp(-0.5 * i * i / (sigma * sigma)));
    sum += i == 0 ? weights.back() : 2 * weights.back();
  }
  std::vector<float> kernel;
  for (const double weight : weights) kernel.push_back(static_cast<float>(weight / sum));
  return kernel;
}

// result[i] over `count` pixels that lie `stride` pixels apart.
void BlurLine(const float* line, int count, std::ptrdiff_t stride, const std::vector<float>& kernel,
              float* result) {
  const auto at = [&](int i) { return line + std::clamp(i, 0, count - 1) * stride * 4; };
  for (int i = 0; i < count; ++i) {
    for (int c = 0; c < 4; ++c) {
      float sum = kernel[0] * at(i)[c];
      for (int k = 1; k < static_cast<int>(kernel.size()); ++k) {
        sum += kernel[static_cast<std::size_t>(k)] * (at(i - k)[c] + at(i + k)[c]);
      }
      result[i * stride * 4 + c] = sum;
    }
  }
}

}  // namespace

HX_Err Blur(const HX_World& from, HX_World& to, float radius) {
  if (from.width != to.width || from.height != to.height) return HX_ERR_UNKNOWN;
  if (!(radius > 0.0f)) return CopyWorld(from, to, nullptr, nullptr);
  const std::uint32_t from_format = FormatOf(from), to_format = FormatOf(to);
  if (!from.data || !to.data || BytesPerPixel(from_format) == 0 || BytesPerPixel(to_format) == 0) {
    return HX_ERR_UNKNOWN;
  }
  const int width = from.width, height = from.height;
  const std::size_t row_size = static_cast<std::size_t>(width) * 4;
  std::vector<float> image(row_size * static_cast<std::size_t>(height)), across(image.size());
  for (int y = 0; y < height; ++y) {
    LoadRow(from_format,
            static_cast<const std::uint8_t*>(from.data) + std::ptrdiff_t{from.row_bytes} * y, width,
            &image[static_cast<std::size_t>(y) * row_size]);
  }
  const std::vector<float> kernel = HalfKernel(radius / 2.0);
  for (int y = 0; y < height; ++y) {
    const std::size_t begin = static_cast<std::size_t>(y) * row_size;
    BlurLine(&image[begin], width, 1, kernel, &across[begin]);
  }
  for (int x = 0; x < width; ++x) {
    const std::size_t begin = static_cast<std::size_t>(x) * 4;
    BlurLine(&across[begin], height, width, kernel, &image[begin]);
  }
  for (int y = 0; y < height; ++y) {
    StoreRow(to_format, &image[static_cast<std::size_t>(y) * row_size], width,
             static_cast<std::uint8_t*>(to.data) + std::ptrdiff_t{to.row_bytes} * y);
  }
  return HX_ERR_NONE;
}

}  // namespace calmframe::host
