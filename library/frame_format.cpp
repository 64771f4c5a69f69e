#include "library/frame_format.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <string>
#include <type_traits>
#include <utility>

#include "library/refusal.h"

namespace calmframe::library {
namespace {

constexpr int kLeastSide = 20;  // a tracking window of the least size needs that much
constexpr std::int64_t kMostPixels = std::int64_t{1} << 27;

[[noreturn]] void Refuse(const std::string& line) {
  throw Refusal(CALMFRAME_ERROR_ARGUMENT, line);
}

struct Packed {
  int components;
  int place[4];  // of red, green, blue, alpha
};
constexpr Packed kPacked[] = {{4, {0, 1, 2, 3}},    // RGBA
                              {4, {2, 1, 0, 3}},    // BGRA
                              {4, {1, 2, 3, 0}},    // ARGB
                              {3, {0, 1, 2, -1}},   // RGB
                              {3, {2, 1, 0, -1}}};  // BGR

struct Planes {
  int shift_x, shift_y;
  AVPixelFormat by_depth[4];  // 8, 10, 12, 16
};
constexpr Planes kPlanes[] = {
    {1, 1, {AV_PIX_FMT_YUV420P, AV_PIX_FMT_YUV420P10, AV_PIX_FMT_YUV420P12, AV_PIX_FMT_YUV420P16}},
    {1, 0, {AV_PIX_FMT_YUV422P, AV_PIX_FMT_YUV422P10, AV_PIX_FMT_YUV422P12, AV_PIX_FMT_YUV422P16}},
    {0, 0, {AV_PIX_FMT_YUV444P, AV_PIX_FMT_YUV444P10, AV_PIX_FMT_YUV444P12, AV_PIX_FMT_YUV444P16}}};

// Between a component of the caller's, one of the host's, and 0 to 1.
template <class Value>
constexpr float kTop = std::is_same_v<Value, std::uint8_t> ? 255.0f : 65535.0f;

template <class Value>
float UnitOf(Value value) {
  if constexpr (std::is_same_v<Value, float>) {
    return std::isfinite(value) ? value : 0.0f;
  } else {
    return static_cast<float>(value) / kTop<Value>;
  }
}

template <class Value>
Value ValueOfUnit(float unit, float top) {
  if constexpr (std::is_same_v<Value, float>) {
    return unit;
  } else {
    return static_cast<Value>(std::clamp(unit, 0.0f, 1.0f) * top + 0.5f);
  }
}

template <class Pixel>
using ComponentOf = decltype(Pixel::alpha);
template <class Pixel>
constexpr float kHostTop = std::is_same_v<Pixel, HX_Pixel8> ? 255.0f : 32768.0f;

template <class Value, class Pixel>
ComponentOf<Pixel> ToHost(Value value) {
  if constexpr (std::is_same_v<Value, std::uint8_t> && std::is_same_v<Pixel, HX_Pixel8>) {
    return value;
  } else {
    return ValueOfUnit<ComponentOf<Pixel>>(UnitOf(value), kHostTop<Pixel>);
  }
}

template <class Pixel>
float HostUnit(ComponentOf<Pixel> value) {
  if constexpr (std::is_same_v<Pixel, HX_PixelFloat>) {
    return value;
  } else {
    return static_cast<float>(value) / kHostTop<Pixel>;
  }
}

template <class Value>
const Value* RowOf(const calmframe_image& image, int y) {
  return reinterpret_cast<const Value*>(static_cast<const std::byte*>(image.plane[0]) +
                                        image.stride[0] * y);
}

template <class Value, class Pixel>
void Unpack(const FrameFormat& format, const calmframe_image& image, host::Picture& picture) {
  const int step = format.components();
  const int* const place = format.place();
  for (int y = 0; y < format.height(); ++y) {
    const Value* from = RowOf<Value>(image, y);
    Pixel* to = picture.row<Pixel>(y);
    for (int x = 0; x < format.width(); ++x, from += step, ++to) {
      to->red = ToHost<Value, Pixel>(from[place[0]]);
      to->green = ToHost<Value, Pixel>(from[place[1]]);
      to->blue = ToHost<Value, Pixel>(from[place[2]]);
      to->alpha = place[3] < 0 ? ValueOfUnit<ComponentOf<Pixel>>(1.0f, kHostTop<Pixel>)
                               : ToHost<Value, Pixel>(from[place[3]]);
    }
  }
}

template <class Pixel, class Value>
void Pack(const FrameFormat& format, const host::WorldBuffer& pixels,
          const calmframe_image& image) {
  constexpr bool kSame = std::is_same_v<Pixel, HX_Pixel8> && std::is_same_v<Value, std::uint8_t>;
  const int step = format.components();
  const int* const place = format.place();
  for (int y = 0; y < format.height(); ++y) {
    const Pixel* from = pixels.row<Pixel>(y);
    Value* to = const_cast<Value*>(RowOf<Value>(image, y));
    for (int x = 0; x < format.width(); ++x, ++from, to += step) {
      const ComponentOf<Pixel> colours[] = {from->red, from->green, from->blue};
      // Without alpha it stands over black.
      const float gain = place[3] < 0 ? HostUnit<Pixel>(from->alpha) : 1.0f;
      for (int c = 0; c < 3; ++c) {
        if constexpr (kSame) {
          if (gain == 1) {
            to[place[c]] = colours[c];
            continue;
          }
        }
        to[place[c]] = ValueOfUnit<Value>(HostUnit<Pixel>(colours[c]) * gain, kTop<Value>);
      }
      if (place[3] < 0) continue;
      if constexpr (kSame) {
        to[place[3]] = from->alpha;
      } else {
        to[place[3]] = ValueOfUnit<Value>(HostUnit<Pixel>(from->alpha), kTop<Value>);
      }
    }
  }
}

// act(a value of the component's type)
template <class Act>
void ByDepth(int depth, const Act& act) {
  if (depth == 8) return act(std::uint8_t{});
  if (depth == 32) return act(float{});
  act(std::uint16_t{});
}

template <class Act>
void ByKind(host::PixelKind kind, const Act& act) {
  if (kind == host::PixelKind::argb8) return act(HX_Pixel8{});
  if (kind == host::PixelKind::argb16) return act(HX_Pixel16{});
  act(HX_PixelFloat{});
}

}  // namespace

FrameFormat::FrameFormat(const calmframe_options& options)
    : width_(options.width),
      height_(options.height),
      format_(options.format),
      depth_(options.depth) {
  if (width_ < kLeastSide || height_ < kLeastSide || std::int64_t{width_} * height_ > kMostPixels) {
    Refuse(std::to_string(width_) + " by " + std::to_string(height_) +
           " pixels: a side has at least 20, a frame at most 2^27");
  }
  const auto depth = "depth " + std::to_string(depth_);
  if (format_ >= CALMFRAME_RGBA && format_ <= CALMFRAME_BGR) {
    if (depth_ != 8 && depth_ != 16 && depth_ != 32)
      Refuse(depth + ": packed formats have 8, 16 or 32");
    components_ = kPacked[format_].components;
    std::copy_n(kPacked[format_].place, 4, place_);
    return;
  }
  if (format_ < CALMFRAME_YUV420P || format_ > CALMFRAME_YUV444P) {
    Refuse("format " + std::to_string(format_) + ": there is none such");
  }
  const Planes& planes = kPlanes[format_ - CALMFRAME_YUV420P];
  const int depths[] = {8, 10, 12, 16};
  const auto known = std::find(std::begin(depths), std::end(depths), depth_);
  if (known == std::end(depths)) Refuse(depth + ": planar formats have 8, 10, 12 or 16");
  shift_x_ = planes.shift_x;
  shift_y_ = planes.shift_y;
  if (width_ % (1 << shift_x_) != 0 || height_ % (1 << shift_y_) != 0) {
    Refuse(std::to_string(width_) + " by " + std::to_string(height_) +
           " pixels: no whole number of chroma samples");
  }
  pixel_format_ = planes.by_depth[known - std::begin(depths)];
}

int FrameFormat::plane_width(int plane) const {
  return plane == 0 ? width_ : width_ >> shift_x_;
}

int FrameFormat::plane_height(int plane) const {
  return plane == 0 ? height_ : height_ >> shift_y_;
}

std::ptrdiff_t FrameFormat::row_bytes(int plane) const {
  const int bytes = depth_ == 8 ? 1 : depth_ == 32 ? 4 : 2;
  return std::ptrdiff_t{plane_width(plane)} * bytes * (is_planar() ? 1 : components_);
}

bool FrameFormat::is_hosts(host::PixelKind kind) const {
  return format_ == CALMFRAME_ARGB && ((depth_ == 8 && kind == host::PixelKind::argb8) ||
                                       (depth_ == 32 && kind == host::PixelKind::argbf));
}

void FrameFormat::Check(const calmframe_image* image, const char* what) const {
  if (!image) Refuse(std::string(what) + ": is null");
  if (image->width != width_ || image->height != height_) {
    Refuse(std::string(what) + ": is " + std::to_string(image->width) + " by " +
           std::to_string(image->height) + " pixels, and the session's frames " +
           std::to_string(width_) + " by " + std::to_string(height_));
  }
  const std::ptrdiff_t word = depth_ == 8 ? 1 : depth_ == 32 ? 4 : 2;
  for (int plane = 0; plane < planes(); ++plane) {
    const std::string name = std::string(what) + ": plane " + std::to_string(plane);
    if (!image->plane[plane]) Refuse(name + " is null");
    const std::ptrdiff_t stride = image->stride[plane];
    constexpr std::ptrdiff_t kMost = std::numeric_limits<int>::max();
    if (stride > kMost || stride < -kMost || std::abs(stride) < row_bytes(plane)) {
      Refuse(name + " has rows of " + std::to_string(row_bytes(plane)) + " bytes, " +
             std::to_string(stride) + " apart");
    }
    if (stride < 0 && is_planar()) Refuse(name + " must have its top row first");
    if (stride % word != 0 ||
        reinterpret_cast<std::uintptr_t>(image->plane[plane]) % static_cast<std::uintptr_t>(word) !=
            0) {
      Refuse(name + " is not aligned to its components");
    }
  }
}

FrameFormat::Buffer FrameFormat::NewBuffer() const {
  Buffer buffer;
  buffer.image.width = width_;
  buffer.image.height = height_;
  for (int plane = 0; plane < planes(); ++plane) {
    buffer.planes.emplace_back(static_cast<std::size_t>(row_bytes(plane)) *
                               static_cast<std::size_t>(plane_height(plane)));
    buffer.image.plane[plane] = buffer.planes.back().data();
    buffer.image.stride[plane] = row_bytes(plane);
  }
  return buffer;
}

// -- Conversion --

FrameConversion::Planar::Planar(const FrameFormat& format, const media::ClipInfo& clip)
    : in(clip), out(format.pixel_format(), format.width(), format.height(), [&] {
        media::ColourModel model =
            media::ModelOf(clip.colour, format.pixel_format(), format.width(), format.height());
        model.fields = clip.field_order != media::FieldOrder::progressive;
        return model;
      }()) {}

class FrameConversion::Lent {
 public:
  explicit Lent(FrameConversion& all) : all_(all) {
    {
      const std::lock_guard lock(all_.mutex_);
      all_.idle_.reserve(all_.idle_.size() + 1);  // giving back needs no memory
      if (!all_.idle_.empty()) {
        planar_ = std::move(all_.idle_.back());
        all_.idle_.pop_back();
      }
    }
    if (!planar_) planar_ = std::make_unique<Planar>(all_.format_, all_.clip_);
  }
  ~Lent() {
    const std::lock_guard lock(all_.mutex_);
    if (all_.idle_.size() < all_.idle_.capacity()) all_.idle_.push_back(std::move(planar_));
  }
  Lent(const Lent&) = delete;
  Lent& operator=(const Lent&) = delete;
  Planar* operator->() { return planar_.get(); }

 private:
  FrameConversion& all_;
  std::unique_ptr<Planar> planar_;
};

FrameConversion::FrameConversion(const FrameFormat& format, const media::ClipInfo& clip)
    : format_(format), clip_(clip) {}

void FrameConversion::ToPicture(const calmframe_image& image, host::Picture& picture) {
  if (!format_.is_planar()) {
    if (format_.is_hosts(host::PixelKind::argb8) && picture.kind() == host::PixelKind::argb8) {
      for (int y = 0; y < format_.height(); ++y) {
        std::memcpy(picture.row<std::uint8_t>(y), RowOf<std::uint8_t>(image, y),
                    static_cast<std::size_t>(format_.row_bytes(0)));
      }
      return;
    }
    ByDepth(format_.depth(), [&]<class Value>(Value) {
      ByKind(picture.kind(),
             [&]<class Pixel>(Pixel) { Unpack<Value, Pixel>(format_, image, picture); });
    });
    return;
  }
  const media::FramePtr frame = media::NewFrame();
  frame->format = format_.pixel_format();
  frame->width = format_.width();
  frame->height = format_.height();
  for (int plane = 0; plane < 3; ++plane) {
    frame->data[plane] = static_cast<std::uint8_t*>(image.plane[plane]);
    frame->linesize[plane] = static_cast<int>(image.stride[plane]);
  }
  frame->colorspace = static_cast<AVColorSpace>(clip_.colour.matrix);
  frame->color_range = static_cast<AVColorRange>(clip_.colour.range);
  frame->chroma_location = static_cast<AVChromaLocation>(clip_.colour.chroma_location);
  frame->color_primaries = AVCOL_PRI_UNSPECIFIED;
  frame->color_trc = AVCOL_TRC_UNSPECIFIED;
  frame->interlaced_frame = clip_.field_order == media::FieldOrder::progressive ? 0 : 1;
  Lent planar(*this);
  ByKind(picture.kind(), [&]<class Pixel>(Pixel) {
    planar->in.Convert(*frame, picture.row<Pixel>(0), picture.row_bytes());
  });
}

void FrameConversion::FromPixels(const host::WorldBuffer& pixels, const calmframe_image& image) {
  const std::uint32_t format = pixels.world().format;
  const host::PixelKind kind = format == HX_FORMAT_ARGB8    ? host::PixelKind::argb8
                               : format == HX_FORMAT_ARGB16 ? host::PixelKind::argb16
                                                            : host::PixelKind::argbf;
  if (!format_.is_planar()) {
    ByDepth(format_.depth(), [&]<class Value>(Value) {
      ByKind(kind, [&]<class Pixel>(Pixel) { Pack<Pixel, Value>(format_, pixels, image); });
    });
    return;
  }
  Lent planar(*this);
  ByKind(kind, [&]<class Pixel>(Pixel) {
    const media::FramePtr frame =
        planar->out.Convert(pixels.row<Pixel>(0), std::ptrdiff_t{pixels.world().row_bytes});
    for (int plane = 0; plane < 3; ++plane) {
      av_image_copy_plane(static_cast<std::uint8_t*>(image.plane[plane]),
                          static_cast<int>(image.stride[plane]), frame->data[plane],
                          frame->linesize[plane], static_cast<int>(format_.row_bytes(plane)),
                          format_.plane_height(plane));
    }
  });
}

}  // namespace calmframe::library
