#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <vector>

#include "host/pixels/pixel_rows.h"
#include "host/pixels/symmetric_sum.h"
#include "host/pixels/world_buffer.h"
#include "host/pixels/world_operations.h"
#include "platform/tessel/threads.h"

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

const std::uint8_t* RowOf(const HX_World& world, int y) {
  return static_cast<const std::uint8_t*>(world.data) + std::ptrdiff_t{world.row_bytes} * y;
}

// The source's rows around one, as floats: each is read once as the middle moves down, and no more
// than the kernel reaches are held.
class RowWindow {
 public:
  RowWindow(const HX_World& from, int reach, std::size_t row_size)
      : from_(from),
        format_(FormatOf(from)),
        reach_(reach),
        held_(std::min(2 * std::int64_t{reach} + 1, std::int64_t{from.height})),
        row_size_(row_size),
        rows_(static_cast<std::size_t>(held_) * row_size),
        taps_(2 * static_cast<std::size_t>(reach) + 1) {}

  // The rows y - reach to y + reach, the first and the last repeated. y must not fall.
  const float* const* Around(int y) {
    const int end = std::min(y + reach_, from_.height - 1) + 1;
    for (next_ = std::max(next_, y - reach_); next_ < end; ++next_) {
      LoadRow(format_, RowOf(from_, next_), from_.width, Row(next_));
    }
    for (int i = -reach_; i <= reach_; ++i) {
      taps_[static_cast<std::size_t>(i + reach_)] = Row(std::clamp(y + i, 0, from_.height - 1));
    }
    return taps_.data();
  }

 private:
  float* Row(int y) { return &rows_[static_cast<std::size_t>(y % held_) * row_size_]; }

  const HX_World& from_;
  const std::uint32_t format_;
  const int reach_;
  const std::int64_t held_;
  const std::size_t row_size_;
  std::vector<float> rows_;
  std::vector<const float*> taps_;
  int next_ = 0;
};

void BlurRows(const HX_World& from, HX_World& to, const std::vector<float>& kernel, int first,
              int end) {
  const auto width = static_cast<std::size_t>(from.width);
  const std::size_t reach = kernel.size() - 1;
  const std::size_t row_size = PaddedForSum(4 * width);
  RowWindow window(from, static_cast<int>(reach), row_size);
  // A row blurred downwards, with its ends repeated as far as the kernel reaches.
  std::vector<float> widened(8 * reach + row_size), blurred(row_size);
  float* const down = &widened[4 * reach];
  std::vector<const float*> shifted;
  for (std::size_t i = 0; i <= 2 * reach; ++i) shifted.push_back(&widened[4 * i]);
  for (int y = first; y < end; ++y) {
    SymmetricSum(window.Around(y), kernel, 4 * width, down);
    for (std::size_t i = 0; i < reach; ++i) {
      std::copy_n(down, 4, &widened[4 * i]);
      std::copy_n(down + 4 * (width - 1), 4, down + 4 * (width + i));
    }
    SymmetricSum(shifted.data(), kernel, 4 * width, blurred.data());
    StoreRow(FormatOf(to), blurred.data(), to.width,
             static_cast<std::uint8_t*>(to.data) + std::ptrdiff_t{to.row_bytes} * y);
  }
}

bool Overlap(const HX_World& a, const HX_World& b) {
  const auto* const a_begin = RowOf(a, 0);
  const auto* const b_begin = RowOf(b, 0);
  return a_begin < RowOf(b, b.height) && b_begin < RowOf(a, a.height);
}

}  // namespace

HX_Err Blur(const HX_World& from, HX_World& to, float radius) {
  if (from.width != to.width || from.height != to.height) return HX_ERR_UNKNOWN;
  if (!(radius > 0.0f)) return CopyWorld(from, to, nullptr, nullptr);
  if (!from.data || !to.data || from.width < 1 || from.height < 1 ||
      BytesPerPixel(FormatOf(from)) == 0 || BytesPerPixel(FormatOf(to)) == 0) {
    return HX_ERR_UNKNOWN;
  }
  if (Overlap(from, to)) {
    WorldBuffer apart(from.width, from.height, FormatOf(from));
    CopyWorld(from, apart.world(), nullptr, nullptr);
    return Blur(apart.world(), to, radius);
  }
  const std::vector<float> kernel = HalfKernel(std::min(radius, 20000.0f) / 2.0);
  // A band reads what the kernel reaches above and below it once more.
  const int band = std::max(64, 2 * static_cast<int>(kernel.size()));
  tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
      [&](std::size_t i) {
        const int first = static_cast<int>(i) * band;
        BlurRows(from, to, kernel, first, std::min(first + band, from.height));
      },
      static_cast<std::size_t>((from.height - 1) / band + 1));
  return HX_ERR_NONE;
}

}  // namespace calmframe::host
