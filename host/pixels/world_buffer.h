#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>

#include "platform/hx/hx_world.h"

namespace calmframe::host {

// Bytes of a pixel of a format (HX_FORMAT_*), 0 for an unknown one.
int BytesPerPixel(std::uint32_t format);
// HX_FORMAT_ARGB8, HX_FORMAT_ARGB16 or HX_FORMAT_ARGBF for 8, 16 or 32 bits; 0 for others.
std::uint32_t FormatOfDepth(int bit_depth);
// The world's format; one that its maker left at 0 is alpha first, of the depth that the flags
// tell.
std::uint32_t FormatOf(const HX_World& world);

HX_Rect Intersect(const HX_Rect& a, const HX_Rect& b);
bool IsEmpty(const HX_Rect& rect);

// A frame buffer that owns its pixels, clear at first, at origin 0. Written by one thread at a
// time.
class WorldBuffer {
 public:
  // Throws std::invalid_argument for an unknown format or a size below 0, std::bad_alloc.
  // `padding`: bytes behind each row, to find out who writes there or takes rows to be packed.
  WorldBuffer(int width, int height, std::uint32_t format, int padding = 0);
  // Lends pixels that `owner` keeps, top row first; nobody may write to them.
  WorldBuffer(const void* pixels, int row_bytes, int width, int height, std::uint32_t format,
              std::shared_ptr<const void> owner);
  WorldBuffer(const WorldBuffer&) = delete;
  WorldBuffer& operator=(const WorldBuffer&) = delete;

  HX_World& world() { return world_; }
  const HX_World& world() const { return world_; }
  std::size_t bytes() const;
  // The buffer's place in layer coordinates.
  HX_Rect rect() const;

  // Row y as pixels of its format.
  template <typename Pixel>
  Pixel* row(int y) {
    return reinterpret_cast<Pixel*>(static_cast<std::uint8_t*>(world_.data) +
                                    std::ptrdiff_t{world_.row_bytes} * y);
  }
  template <typename Pixel>
  const Pixel* row(int y) const {
    return const_cast<WorldBuffer*>(this)->row<Pixel>(y);
  }

  // False once somebody wrote behind a row's pixels.
  bool PaddingIntact() const;

 private:
  std::unique_ptr<std::uint8_t[], void (*)(void*)> pixels_;
  std::shared_ptr<const void> owner_;
  HX_World world_{};
};

}  // namespace calmframe::host
