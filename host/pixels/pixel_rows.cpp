#include "host/pixels/pixel_rows.h"

#include <cstddef>
#include <cstring>

#include "platform/hx/hx_world.h"

namespace calmframe::host {
namespace {

// Where a pixel's alpha, red, green and blue stand.
enum class Order { alpha_first, blue_first };

template <typename Channel, Order order>
void Load(const void* pixels, int count, float full, float* row) {
  const auto* const channels = static_cast<const Channel*>(pixels);
  for (std::ptrdiff_t i = 0; i < std::ptrdiff_t{count} * 4; ++i) {
    row[i] = static_cast<float>(channels[order == Order::alpha_first ? i : i ^ 3]) / full;
  }
}

template <typename Channel>
Channel ToChannel(float value, float full) {
  const float positive = value > 0.0f ? value : 0.0f;
  const float within = positive < 1.0f ? positive : 1.0f;
  return static_cast<Channel>(static_cast<std::int32_t>(within * full + 0.5f));
}

template <typename Channel, Order order>
void Store(const float* row, int count, float full, void* pixels) {
  auto* const channels = static_cast<Channel*>(pixels);
  for (std::ptrdiff_t i = 0; i < std::ptrdiff_t{count} * 4; ++i) {
    channels[order == Order::alpha_first ? i : i ^ 3] = ToChannel<Channel>(row[i], full);
  }
}

}  // namespace

void LoadRow(std::uint32_t format, const void* pixels, int count, float* row) {
  switch (format) {
    case HX_FORMAT_ARGB8:
      return Load<std::uint8_t, Order::alpha_first>(pixels, count, 255.0f, row);
    case HX_FORMAT_BGRA8:
      return Load<std::uint8_t, Order::blue_first>(pixels, count, 255.0f, row);
    case HX_FORMAT_ARGB16:
      return Load<std::uint16_t, Order::alpha_first>(pixels, count, 32768.0f, row);
    default:
      std::memcpy(row, pixels, static_cast<std::size_t>(count) * sizeof(HX_PixelFloat));
  }
}

void StoreRow(std::uint32_t format, const float* row, int count, void* pixels) {
  switch (format) {
    case HX_FORMAT_ARGB8:
      return Store<std::uint8_t, Order::alpha_first>(row, count, 255.0f, pixels);
    case HX_FORMAT_BGRA8:
      return Store<std::uint8_t, Order::blue_first>(row, count, 255.0f, pixels);
    case HX_FORMAT_ARGB16:
      return Store<std::uint16_t, Order::alpha_first>(row, count, 32768.0f, pixels);
    default:
      std::memcpy(pixels, row, static_cast<std::size_t>(count) * sizeof(HX_PixelFloat));
  }
}

}  // namespace calmframe::host
