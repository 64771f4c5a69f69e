#pragma once

#include <cstddef>
#include <memory>
#include <mutex>
#include <vector>

#include "host/media/clip.h"
#include "host/media/pixel_conversion.h"
#include "host/pixels/world_buffer.h"
#include "host/timeline/picture.h"
#include "library/calmframe.h"

namespace calmframe::library {

// How the caller's frames lie in memory.
class FrameFormat {
 public:
  // Throws Refusal for a size, format or depth that there is not.
  explicit FrameFormat(const calmframe_options& options);

  int width() const { return width_; }
  int height() const { return height_; }
  int depth() const { return depth_; }
  bool is_planar() const { return pixel_format_ != AV_PIX_FMT_NONE; }
  AVPixelFormat pixel_format() const { return pixel_format_; }  // of planar frames
  // Of packed ones: how many components a pixel has, and which of them is red, green, blue, alpha
  // (below 0: none).
  int components() const { return components_; }
  const int* place() const { return place_; }
  int planes() const { return is_planar() ? 3 : 1; }
  int plane_width(int plane) const;  // samples or pixels
  int plane_height(int plane) const;
  std::ptrdiff_t row_bytes(int plane) const;  // that a plane's row holds
  // Its rows are a host's picture's, byte for byte, but for their distance.
  bool is_hosts(host::PixelKind kind) const;

  // Throws Refusal for an image that is no frame of this format. `what`: "the image".
  void Check(const calmframe_image* image, const char* what) const;

  // Rows of its own, one behind the other.
  struct Buffer {
    std::vector<std::vector<std::byte>> planes;
    calmframe_image image{};
  };
  Buffer NewBuffer() const;

 private:
  int width_, height_, format_, depth_;
  AVPixelFormat pixel_format_ = AV_PIX_FMT_NONE;
  int components_ = 0;
  int place_[4] = {0, 1, 2, 3};
  int shift_x_ = 0, shift_y_ = 0;  // of chroma
};

// The caller's frames to the host's pictures and back. Any thread.
class FrameConversion {
 public:
  // `clip`: tells size, colours and fields.
  FrameConversion(const FrameFormat& format, const media::ClipInfo& clip);

  // `image` and `picture` are of the format's size. Throws std::bad_alloc.
  void ToPicture(const calmframe_image& image, host::Picture& picture);
  void FromPixels(const host::WorldBuffer& pixels, const calmframe_image& image);

 private:
  // What conversions of planar frames keep from one to the next, for one thread at a time.
  struct Planar {
    Planar(const FrameFormat& format, const media::ClipInfo& clip);
    media::FrameToPixels in;
    media::PixelsToFrame out;
  };
  class Lent;

  const FrameFormat format_;
  const media::ClipInfo clip_;
  std::mutex mutex_;
  std::vector<std::unique_ptr<Planar>> idle_;  // guarded by mutex_
};

}  // namespace calmframe::library
