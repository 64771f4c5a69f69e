#include <cstddef>
#include <cstdint>
#include <vector>

#include "host/pixels/pixel_rows.h"
#include "host/pixels/world_buffer.h"
#include "host/pixels/world_operations.h"

namespace calmframe::host {
namespace {

// Into `to`, which is either of both; alpha of `front` is what it covers with.
void Compose(const float* front, const float* back, float* to) {
  const float behind = back[0] * (1.0f - front[0]);
  const float alpha = front[0] + behind;
  for (std::size_t c = 1; c < 4; ++c) {
    to[c] = alpha > 0.0f ? (front[c] * front[0] + back[c] * behind) / alpha : 0.0f;
  }
  to[0] = alpha > 0.0f ? alpha : 0.0f;
}

}  // namespace

HX_Err Transfer(const HX_World& from, const HX_TransferMode& mode, int x, int y, HX_World& to) {
  const std::uint32_t from_format = FormatOf(from), to_format = FormatOf(to);
  const int from_bytes = BytesPerPixel(from_format), to_bytes = BytesPerPixel(to_format);
  const bool in_front = mode.mode == HX_TRANSFER_IN_FRONT;
  if (!from.data || !to.data || from_bytes == 0 || to_bytes == 0 ||
      (!in_front && mode.mode != HX_TRANSFER_BEHIND)) {
    return HX_ERR_UNKNOWN;
  }
  const HX_Rect part =
      Intersect({x, y, x + from.width, y + from.height}, {0, 0, to.width, to.height});
  if (IsEmpty(part)) return HX_ERR_NONE;
  const float opacity = to_bytes == 4 ? static_cast<float>(mode.opacity) / 255.0f
                                      : static_cast<float>(mode.opacity_u16) / 32768.0f;
  const int width = part.right - part.left;
  std::vector<float> source(static_cast<std::size_t>(width) * 4), target(source.size());
  for (int row = part.top; row < part.bottom; ++row) {
    const auto* pixels = static_cast<const std::uint8_t*>(from.data) +
                         std::ptrdiff_t{from.row_bytes} * (row - y) +
                         std::ptrdiff_t{part.left - x} * from_bytes;
    auto* result = static_cast<std::uint8_t*>(to.data) + std::ptrdiff_t{to.row_bytes} * row +
                   std::ptrdiff_t{part.left} * to_bytes;
    LoadRow(from_format, pixels, width, source.data());
    LoadRow(to_format, result, width, target.data());
    for (std::size_t i = 0; i < source.size(); i += 4) {
      float* s = &source[i];
      float* d = &target[i];
      s[0] *= opacity;
      if (in_front) {
        Compose(s, d, d);
      } else {
        Compose(d, s, d);
      }
    }
    StoreRow(to_format, target.data(), width, result);
  }
  return HX_ERR_NONE;
}

}  // namespace calmframe::host
