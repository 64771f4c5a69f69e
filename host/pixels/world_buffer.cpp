#include "host/pixels/world_buffer.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <new>
#include <stdexcept>
#include <utility>

namespace calmframe::host {
namespace {

constexpr std::uint8_t kPadding = 0xa5;

std::uint8_t* AllocateClear(std::size_t size) {
  auto* bytes = static_cast<std::uint8_t*>(std::calloc(std::max<std::size_t>(size, 1), 1));
  if (!bytes) throw std::bad_alloc();
  return bytes;
}

}  // namespace

int BytesPerPixel(std::uint32_t format) {
  switch (format) {
    case HX_FORMAT_ARGB8:
    case HX_FORMAT_BGRA8:
      return 4;
    case HX_FORMAT_ARGB16:
      return 8;
    case HX_FORMAT_ARGBF:
      return 16;
    default:
      return 0;
  }
}

std::uint32_t FormatOfDepth(int bit_depth) {
  switch (bit_depth) {
    case 8:
      return HX_FORMAT_ARGB8;
    case 16:
      return HX_FORMAT_ARGB16;
    case 32:
      return HX_FORMAT_ARGBF;
    default:
      return 0;
  }
}

std::uint32_t FormatOf(const HX_World& world) {
  if (world.format != 0) return world.format;
  return world.flags & HX_WORLD_DEEP ? HX_FORMAT_ARGB16 : HX_FORMAT_ARGB8;
}

HX_Rect Intersect(const HX_Rect& a, const HX_Rect& b) {
  return {std::max(a.left, b.left), std::max(a.top, b.top), std::min(a.right, b.right),
          std::min(a.bottom, b.bottom)};
}

bool IsEmpty(const HX_Rect& rect) {
  return rect.right <= rect.left || rect.bottom <= rect.top;
}

WorldBuffer::WorldBuffer(int width, int height, std::uint32_t format, int padding)
    : pixels_(nullptr, std::free) {
  const int pixel = BytesPerPixel(format);
  if (pixel == 0 || width < 0 || height < 0 || padding < 0) {
    throw std::invalid_argument("frame buffer of unknown format or negative size");
  }
  const std::int64_t row_bytes = std::int64_t{width} * pixel + padding;
  if (row_bytes > std::numeric_limits<std::int32_t>::max()) throw std::bad_alloc();
  pixels_.reset(AllocateClear(static_cast<std::size_t>(row_bytes * height)));
  world_.data = pixels_.get();
  world_.row_bytes = static_cast<std::int32_t>(row_bytes);
  world_.width = width;
  world_.height = height;
  world_.flags = format == HX_FORMAT_ARGB16 ? std::uint32_t{HX_WORLD_DEEP} : 0U;
  world_.format = format;
  world_.extent = {0, 0, width, height};
  if (padding > 0) {
    for (int y = 0; y < height; ++y) {
      std::memset(row<std::uint8_t>(y) + std::ptrdiff_t{width} * pixel, kPadding,
                  static_cast<std::size_t>(padding));
    }
  }
}

WorldBuffer::WorldBuffer(const void* pixels, int row_bytes, int width, int height,
                         std::uint32_t format, std::shared_ptr<const void> owner)
    : pixels_(nullptr, std::free), owner_(std::move(owner)) {
  world_.data = const_cast<void*>(pixels);
  world_.row_bytes = row_bytes;
  world_.width = width;
  world_.height = height;
  world_.flags = format == HX_FORMAT_ARGB16 ? std::uint32_t{HX_WORLD_DEEP} : 0U;
  world_.format = format;
  world_.extent = {0, 0, width, height};
}

std::size_t WorldBuffer::bytes() const {
  return static_cast<std::size_t>(world_.row_bytes) * static_cast<std::size_t>(world_.height);
}

HX_Rect WorldBuffer::rect() const {
  return {world_.origin_x, world_.origin_y, world_.origin_x + world_.width,
          world_.origin_y + world_.height};
}

bool WorldBuffer::PaddingIntact() const {
  if (!pixels_) return true;
  const std::ptrdiff_t used = std::ptrdiff_t{world_.extent.right} * BytesPerPixel(world_.format);
  for (int y = 0; y < world_.height; ++y) {
    const auto* bytes = row<std::uint8_t>(y);
    if (!std::all_of(bytes + used, bytes + world_.row_bytes,
                     [](std::uint8_t byte) { return byte == kPadding; })) {
      return false;
    }
  }
  return true;
}

}  // namespace calmframe::host
