#include "editors/mlt/pictures.h"

#include <memory>
#include <new>
#include <stdexcept>

extern "C" {
#include <libswscale/swscale.h>
}

namespace calmframe::mlt {
namespace {

AVPixelFormat ScalerFormat(mlt_image_format format) {
  switch (format) {
    case mlt_image_rgb:
      return AV_PIX_FMT_RGB24;
    case mlt_image_rgba:
      return AV_PIX_FMT_RGBA;
    case mlt_image_yuv422:
      return AV_PIX_FMT_YUYV422;
    case mlt_image_yuv420p:
      return AV_PIX_FMT_YUV420P;
    case mlt_image_yuv422p16:
      return AV_PIX_FMT_YUV422P16LE;
    default:
      return AV_PIX_FMT_NONE;
  }
}

}  // namespace

mlt_image_format WorkedFormat(mlt_image_format format) {
  return ScalerFormat(format) == AV_PIX_FMT_NONE ? mlt_image_rgba : format;
}

void SetKind(const PictureKind& kind, calmframe_options* options) {
  options->matrix = kind.colorspace == 601    ? 6
                    : kind.colorspace == 709  ? 1
                    : kind.colorspace == 2020 ? 9
                                              : 2;
  options->full_range = kind.full_range ? 1 : 0;
  options->depth = kind.format == mlt_image_yuv422p16 ? 16 : 8;
  options->format = kind.format == mlt_image_rgb       ? CALMFRAME_RGB
                    : kind.format == mlt_image_rgba    ? CALMFRAME_RGBA
                    : kind.format == mlt_image_yuv420p ? CALMFRAME_YUV420P
                                                       : CALMFRAME_YUV422P;
}

PoolImage::PoolImage(mlt_image_format format, int width, int height)
    : size_(mlt_image_format_size(format, width, height, nullptr)),
      data_(static_cast<std::uint8_t*>(mlt_pool_alloc(size_))) {
  if (!data_) throw std::bad_alloc();
}

PoolImage::~PoolImage() {
  if (data_) mlt_pool_release(data_);
}

std::uint8_t* PoolImage::GiveTo(mlt_frame frame) {
  std::uint8_t* const data = data_;
  mlt_frame_set_image(frame, data, size_, mlt_pool_release);
  data_ = nullptr;
  return data;
}

SessionImage::SessionImage(mlt_image_format format, int width, int height, std::uint8_t* data)
    : format_(format), data_(data) {
  image_.width = width;
  image_.height = height;
  if (format != mlt_image_yuv422) {
    std::uint8_t* planes[4];
    int strides[4];
    mlt_image_format_planes(format, width, height, data, planes, strides);
    for (int p = 0; p < 3; ++p) {
      image_.plane[p] = planes[p];
      image_.stride[p] = strides[p];
    }
    return;
  }
  const std::size_t w = static_cast<std::size_t>(width), h = static_cast<std::size_t>(height);
  planes_.resize(2 * w * h);
  std::uint8_t *luma = planes_.data(), *blue = luma + w * h, *red = blue + w / 2 * h;
  image_.plane[0] = luma;
  image_.plane[1] = blue;
  image_.plane[2] = red;
  image_.stride[0] = width;
  image_.stride[1] = image_.stride[2] = width / 2;
  for (std::size_t i = 0; i < w * h / 2; ++i) {
    luma[2 * i] = data[4 * i];
    blue[i] = data[4 * i + 1];
    luma[2 * i + 1] = data[4 * i + 2];
    red[i] = data[4 * i + 3];
  }
}

void SessionImage::Finish() {
  if (format_ != mlt_image_yuv422) return;
  const std::size_t pairs =
      static_cast<std::size_t>(image_.width) * static_cast<std::size_t>(image_.height) / 2;
  const std::uint8_t *luma = planes_.data(), *blue = luma + 2 * pairs, *red = blue + pairs;
  for (std::size_t i = 0; i < pairs; ++i) {
    data_[4 * i] = luma[2 * i];
    data_[4 * i + 1] = blue[i];
    data_[4 * i + 2] = luma[2 * i + 1];
    data_[4 * i + 3] = red[i];
  }
}

void Scale(mlt_image_format format, int from_width, int from_height, std::uint8_t* from,
           int to_width, int to_height, std::uint8_t* to) {
  const AVPixelFormat kind = ScalerFormat(format);
  const std::unique_ptr<SwsContext, decltype(&sws_freeContext)> scaler(
      sws_getContext(from_width, from_height, kind, to_width, to_height, kind,
                     SWS_BICUBIC | SWS_ACCURATE_RND, nullptr, nullptr, nullptr),
      sws_freeContext);
  if (!scaler) throw std::runtime_error("pictures of this size can't be scaled");
  std::uint8_t *from_planes[4], *to_planes[4];
  int from_strides[4], to_strides[4];
  mlt_image_format_planes(format, from_width, from_height, from, from_planes, from_strides);
  mlt_image_format_planes(format, to_width, to_height, to, to_planes, to_strides);
  sws_scale(scaler.get(), from_planes, from_strides, 0, from_height, to_planes, to_strides);
}

}  // namespace calmframe::mlt
