#pragma once

// Rules that hold throughout this folder. A frame is rows of pixels, top row first, row_bytes apart
// (any padding); a pixel is alpha, red, green, blue in memory, not premultiplied. A pixel's centre
// lies at whole coordinates. Warps lead from the source to the output: a vertex is where a source
// point lands. Outside the source there is nothing: the output stays transparent black.

#include <boost/gil/image_view_factory.hpp>
#include <boost/gil/typedefs.hpp>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <memory>

#include "platform/hx/hx_world.h"

namespace marrow::render {

// The gil view of a frame of `Pixel`, how the host calls its format, and what is full.
template <class Pixel>
struct world_view;
template <>
struct world_view<HX_Pixel8> {
  using type = boost::gil::argb8_view_t;
  static constexpr std::uint32_t format = HX_FORMAT_ARGB8;
  static constexpr std::uint8_t full = 255;
};
template <>
struct world_view<HX_Pixel16> {
  using type = boost::gil::argb16_view_t;
  static constexpr std::uint32_t format = HX_FORMAT_ARGB16;
  static constexpr std::uint16_t full = 32768;
};
template <>
struct world_view<HX_PixelFloat> {
  using type = boost::gil::argb32f_view_t;
  static constexpr std::uint32_t format = HX_FORMAT_ARGBF;
  static constexpr float full = 1.0f;
};

// A frame buffer: its own, or one that somebody else keeps alive.
template <class Pixel>
class WorldX {
 public:
  using view_type = typename world_view<Pixel>::type;
  using const_view_type = typename view_type::const_t;

  // Owns a cleared buffer without padding.
  WorldX(int width, int height)
      : owned_(new Pixel[static_cast<std::size_t>(width) * static_cast<std::size_t>(height)]()),
        data_(owned_.get()),
        width_(width),
        height_(height),
        row_bytes_(static_cast<std::ptrdiff_t>(sizeof(Pixel)) * width) {}
  // Borrows `data`, which must outlive this. row_bytes: at least width pixels.
  WorldX(int width, int height, std::ptrdiff_t row_bytes, Pixel* data)
      : data_(data), width_(width), height_(height), row_bytes_(row_bytes) {}

  int width() const { return width_; }
  int height() const { return height_; }
  std::ptrdiff_t row_bytes() const { return row_bytes_; }
  Pixel* data() { return data_; }
  const Pixel* data() const { return data_; }
  Pixel* row(int y) {
    return reinterpret_cast<Pixel*>(reinterpret_cast<unsigned char*>(data_) + row_bytes_ * y);
  }
  const Pixel* row(int y) const { return const_cast<WorldX*>(this)->row(y); }

  view_type view() {
    return boost::gil::interleaved_view(
        static_cast<std::ptrdiff_t>(width_), static_cast<std::ptrdiff_t>(height_),
        reinterpret_cast<typename view_type::value_type*>(data_), row_bytes_);
  }
  const_view_type view() const { return const_cast<WorldX*>(this)->view(); }

  // Transparent black; padding is left alone.
  void clear() { clear(0, height_); }
  // Of rows [first, end) alone.
  void clear(int first, int end) {
    const std::size_t bytes = sizeof(Pixel) * static_cast<std::size_t>(width_);
    if (row_bytes_ == static_cast<std::ptrdiff_t>(bytes)) {
      if (bytes != 0 && first < end) {
        std::memset(static_cast<void*>(row(first)), 0,
                    bytes * static_cast<std::size_t>(end - first));
      }
      return;
    }
    for (int y = first; y < end; ++y) std::memset(static_cast<void*>(row(y)), 0, bytes);
  }

 private:
  std::unique_ptr<Pixel[]> owned_;
  Pixel* data_;
  int width_;
  int height_;
  std::ptrdiff_t row_bytes_;
};

// The same pixels as the host's operations take them, at origin 0; to be read only, if the world
// is.
template <class Pixel>
HX_World world_of(const WorldX<Pixel>& world) {
  HX_World record{};
  record.data = const_cast<Pixel*>(world.data());
  record.row_bytes = static_cast<std::int32_t>(world.row_bytes());
  record.width = world.width();
  record.height = world.height();
  record.format = world_view<Pixel>::format;
  record.flags = record.format == HX_FORMAT_ARGB16 ? HX_WORLD_DEEP : 0;
  record.extent = {0, 0, world.width(), world.height()};
  return record;
}

// How a frame is composed behind another, at full opacity.
inline constexpr HX_TransferMode kBehind{HX_TRANSFER_BEHIND, 0, 255, 0, 32768};

}  // namespace marrow::render
