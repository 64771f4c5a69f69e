#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "host/media/colour_model.h"
#include "host/media/ffmpeg.h"
#include "host/media/planar_yuv.h"
#include "platform/hx/hx_pixel.h"

// Between a file's frames and the host's pixels. Planar YUV goes to and from 8 bits by PlanarYuv;
// for all else swscale brings chroma to full size and back (each field by itself in an interlaced
// 4:2:0 frame, at the tagged chroma position). For 16 bits and floats the colour matrix is
// DeepYuv's, since swscale's falls short of full white by 0.4 %.
namespace calmframe::media {

// A swscale context that is made again when its frames change.
class Scaler {
 public:
  void Scale(const AVFrame& from, AVFrame& to, const ColourModel& model);

 private:
  void ScalePart(const AVFrame& from, AVFrame& to, const ColourModel& model, int part);

  struct Key {
    int from_width = 0, from_height = 0, from_format = -1;
    int to_width = 0, to_height = 0, to_format = -1;
    int matrix = -1, chroma = -1;
    bool full_range = false;
    bool operator==(const Key&) const = default;
  };
  Key keys_[3];  // whole frame, top field, bottom field
  ScalerPtr contexts_[3];
};

// Decoded frames to pixels as shown. Pixel: HX_Pixel8, HX_Pixel16, HX_PixelFloat.
class FrameToPixels {
 public:
  explicit FrameToPixels(const ClipInfo& info) : info_(info) {}

  template <class Pixel>
  void Convert(const AVFrame& frame, Pixel* pixels, std::ptrdiff_t row_bytes);

 private:
  template <class Pixel>
  void ConvertStored(const AVFrame& frame, Pixel* pixels, std::ptrdiff_t row_bytes);

  const ClipInfo& info_;
  PlanarYuv planar_;
  Scaler scaler_;
  Scaler resizer_;
  FramePtr resized_;
  FramePtr planes_;
  std::vector<std::uint8_t> turned_;
};

// Pixels to frames for an encoder. Where the format has no alpha, pixels stand over black.
class PixelsToFrame {
 public:
  PixelsToFrame(AVPixelFormat format, int width, int height, const ColourModel& model)
      : format_(format), width_(width), height_(height), model_(model) {}

  template <class Pixel>
  FramePtr Convert(const Pixel* pixels, std::ptrdiff_t row_bytes);

 private:
  const AVPixelFormat format_;
  const int width_;
  const int height_;
  const ColourModel model_;
  PlanarYuv planar_;
  Scaler scaler_;
  FramePtr planes_;
  FramePtr last_;
};

}  // namespace calmframe::media
