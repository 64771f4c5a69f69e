#pragma once

#include <boost/enable_shared_from_this.hpp>
#include <boost/shared_ptr.hpp>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <vector>

#include "platform/hx/hx_world.h"

namespace calmframe::host {

// The host's three depths; see platform/hx/hx_pixel.h.
enum class PixelKind { argb8, argb16, argbf };

std::uint32_t FormatOf(PixelKind kind);  // HX_FORMAT_*
PixelKind KindOfDepth(int bits);         // 8; 16 above it; float above 16

// One frame's pixels, straight alpha. Written by whoever makes it, constant once it is shared.
class Picture {
 public:
  Picture(PixelKind kind, int width, int height, std::ptrdiff_t row_bytes, bool top_down,
          std::unique_ptr<std::uint8_t[]> memory)
      : kind_(kind),
        width_(width),
        height_(height),
        row_bytes_(row_bytes),
        top_down_(top_down),
        memory_(std::move(memory)) {}

  PixelKind kind() const { return kind_; }
  int width() const { return width_; }
  int height() const { return height_; }
  std::ptrdiff_t row_bytes() const { return row_bytes_; }  // >= width pixels
  bool top_down() const { return top_down_; }              // the first row in memory is the top one
  std::size_t bytes() const { return static_cast<std::size_t>(row_bytes_ * height_); }

  std::uint8_t* memory() { return memory_.get(); }
  const std::uint8_t* memory() const { return memory_.get(); }

  // Row y from the top. Pixel is the one of kind().
  template <class Pixel>
  Pixel* row(int y) {
    return reinterpret_cast<Pixel*>(memory_.get() + Offset(y));
  }
  template <class Pixel>
  const Pixel* row(int y) const {
    return reinterpret_cast<const Pixel*>(memory_.get() + Offset(y));
  }

  // Lets go of the memory, of bytes() bytes.
  std::unique_ptr<std::uint8_t[]> TakeMemory() { return std::move(memory_); }

 private:
  std::ptrdiff_t Offset(int y) const { return row_bytes_ * (top_down_ ? y : height_ - 1 - y); }

  PixelKind kind_;
  int width_, height_;
  std::ptrdiff_t row_bytes_;
  bool top_down_;
  std::unique_ptr<std::uint8_t[]> memory_;
};

using PicturePtr = boost::shared_ptr<const Picture>;

// Makes pictures and keeps the memory of the last few that went, since fresh pages cost as much as
// a frame's conversion. Any thread; pictures may outlive it.
class PicturePool : public boost::enable_shared_from_this<PicturePool> {
 public:
  static boost::shared_ptr<PicturePool> Make();

  // Pixels are not set. `padding`: bytes behind each row. Throws std::bad_alloc.
  boost::shared_ptr<Picture> NewPicture(PixelKind kind, int width, int height,
                                        std::ptrdiff_t padding = 0, bool top_down = true);

 private:
  struct Block {
    std::size_t bytes = 0;
    std::unique_ptr<std::uint8_t[]> memory;
  };
  void Recycle(Picture& picture);

  std::mutex mutex_;
  std::vector<Block> spare_;  // guarded by mutex_
};

// The picture as a world of an effect, origin 0, for as long as the picture lives. Of a top-down
// picture; effects only read it.
HX_World WorldOf(const Picture& picture);

// Sets every pixel to colour(x, y), 0 to 1, rounded to the picture's kind.
void FillPicture(Picture& picture, const std::function<HX_PixelFloat(int x, int y)>& colour);

// Replaces the lines of the other parity (0: lines 0, 2, 4 ...) by the average of the lines above
// and below, colours weighted by alpha; at the frame's edge by the nearest. A frame of one line
// stays as it is.
void KeepField(Picture& picture, int parity);

// Fills `to` from all of `from`, as CopyWorld does. Both are top-down.
void ScalePicture(const Picture& from, Picture& to);

}  // namespace calmframe::host
