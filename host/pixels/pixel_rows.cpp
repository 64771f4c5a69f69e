#include "host/pixels/pixel_rows.h"

#include <array>
#include <cstddef>
#include <cstring>

#include "platform/hx/hx_world.h"

namespace calmframe::host {
namespace {

// Where alpha, red, green and blue stand in a pixel.
constexpr std::array<int, 4> kAlphaFirst = {0, 1, 2, 3};
constexpr std::array<int, 4> kBlueFirst = {3, 2, 1, 0};

template <typename Channel>
void Load(const void* pixels, int count, float full, const std::array<int, 4>& places, float* row) {
  const auto* pixel = static_cast<const Channel*>(pixels);
  for (int i = 0; i < count; ++i, pixel += 4, row += 4) {
    for (std::size_t c = 0; c < 4; ++c) row[c] = static_cast<float>(pixel[places[c]]) / full;
  }
}

template <typename Channel>
Channel ToChannel(float value, float full) {
  if (!(value > 0.0f)) return 0;
  return static_cast<Channel>(value < 1.0f ? value * full + 0.5f : full);
}

template <typename Channel>
void Store(const float* row, int count, float full, const std::array<int, 4>& places,
           void* pixels) {
  auto* pixel = static_cast<Channel*>(pixels);
  for (int i = 0; i < count; ++i, pixel += 4, row += 4) {
    for (std::size_t c = 0; c < 4; ++c) pixel[places[c]] = ToChannel<Channel>(row[c], full);
  }
}

}  // namespace

void LoadRow(std::uint32_t format, const void* pixels, int count, float* row) {
  switch (format) {
    case HX_FORMAT_ARGB8:
      return Load<std::uint8_t>(pixels, count, 255.0f, kAlphaFirst, row);
    case HX_FORMAT_BGRA8:
      return Load<std::uint8_t>(pixels, count, 255.0f, kBlueFirst, row);
    case HX_FORMAT_ARGB16:
      return Load<std::uint16_t>(pixels, count, 32768.0f, kAlphaFirst, row);
    default:
      std::memcpy(row, pixels, static_cast<std::size_t>(count) * sizeof(HX_PixelFloat));
  }
}

void StoreRow(std::uint32_t format, const float* row, int count, void* pixels) {
  switch (format) {
    case HX_FORMAT_ARGB8:
      return Store<std::uint8_t>(row, count, 255.0f, kAlphaFirst, pixels);
    case HX_FORMAT_BGRA8:
      return Store<std::uint8_t>(row, count, 255.0f, kBlueFirst, pixels);
    case HX_FORMAT_ARGB16:
      return Store<std::uint16_t>(row, count, 32768.0f, kAlphaFirst, pixels);
    default:
      std::memcpy(pixels, row, static_cast<std::size_t>(count) * sizeof(HX_PixelFloat));
  }
}

}  // namespace calmframe::host
