#include "host/media/pixel_conversion.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <thread>
#include <type_traits>

#include "host/media/deep_yuv.h"
#include "host/media/pixel_planes.h"

namespace calmframe::media {
namespace {

constexpr int kTurnTile = 16;  // pixels; two tiles of the widest pixel fit in the first-level cache

int SwscaleMatrix(AVColorSpace matrix) {
  switch (matrix) {
    case AVCOL_SPC_BT709:
      return SWS_CS_ITU709;
    case AVCOL_SPC_FCC:
      return SWS_CS_FCC;
    case AVCOL_SPC_SMPTE240M:
      return SWS_CS_SMPTE240M;
    case AVCOL_SPC_BT2020_NCL:
      return SWS_CS_BT2020;
    default:
      return SWS_CS_ITU601;
  }
}

// Its full-range twins have the same words, but swscale squeezes them whatever it is told.
int WithoutRange(int format) {
  switch (format) {
    case AV_PIX_FMT_YUVJ411P:
      return AV_PIX_FMT_YUV411P;
    case AV_PIX_FMT_YUVJ420P:
      return AV_PIX_FMT_YUV420P;
    case AV_PIX_FMT_YUVJ422P:
      return AV_PIX_FMT_YUV422P;
    case AV_PIX_FMT_YUVJ440P:
      return AV_PIX_FMT_YUV440P;
    case AV_PIX_FMT_YUVJ444P:
      return AV_PIX_FMT_YUV444P;
    default:
      return format;
  }
}

const AVPixFmtDescriptor& LayoutOf(const AVFrame& frame) {
  return *NotNull(av_pix_fmt_desc_get(static_cast<AVPixelFormat>(frame.format)));
}

AVFrame& Reuse(FramePtr& frame, int format, int width, int height) {
  if (!frame || frame->format != format || frame->width != width || frame->height != height) {
    frame = NewPicture(format, width, height);
  }
  return *frame;
}

template <class Pixel>
Pixel* Row(Pixel* pixels, std::ptrdiff_t row_bytes, int y) {
  using Byte = std::conditional_t<std::is_const_v<Pixel>, const std::uint8_t, std::uint8_t>;
  return reinterpret_cast<Pixel*>(reinterpret_cast<Byte*>(pixels) + y * row_bytes);
}

template <class Pixel>
Pixel FromUnit(float alpha, float red, float green, float blue) {
  const auto unit = [](float value) { return std::min(std::max(value, 0.0f), 1.0f); };
  if constexpr (std::is_same_v<Pixel, HX_PixelFloat>) {
    return {unit(alpha), unit(red), unit(green), unit(blue)};
  } else {
    constexpr float kTop = std::is_same_v<Pixel, HX_Pixel8> ? 255.0f : 32768.0f;
    using Value = decltype(Pixel::alpha);
    const auto value = [&](float v) { return static_cast<Value>(unit(v) * kTop + 0.5f); };
    return {value(alpha), value(red), value(green), value(blue)};
  }
}

template <class Pixel>
constexpr float kUnit = std::is_same_v<Pixel, HX_Pixel8>    ? 1.0f / 255
                        : std::is_same_v<Pixel, HX_Pixel16> ? 1.0f / 32768
                                                            : 1.0f;

// The row of a frame's plane of 16 bits, or null.
std::uint16_t* Row16(const AVFrame& frame, int plane, int y) {
  return frame.data[plane]
             ? Row(reinterpret_cast<std::uint16_t*>(frame.data[plane]), frame.linesize[plane], y)
             : nullptr;
}

// A row of a YUV frame's alpha, its words shifted up to 16 bits as DeepYuv has them. swscale would
// repeat their upper bits in the lower ones.
void ReadAlpha(const AVFrame& frame, int y, std::uint16_t* words) {
  const AVPixFmtDescriptor& layout = LayoutOf(frame);
  const std::uint8_t* data[4] = {frame.data[0], frame.data[1], frame.data[2], frame.data[3]};
  av_read_image_line2(words, data, frame.linesize, &layout, 0, y, 3, frame.width, 0, 2);
  const int shift = 16 - layout.comp[3].depth;
  for (int x = 0; x < frame.width; ++x) words[x] = static_cast<std::uint16_t>(words[x] << shift);
}

// The way back, into a plane of its own; rounds `words` to its depth.
void WriteAlpha(std::uint16_t* words, int y, AVFrame& frame) {
  const AVPixFmtDescriptor& layout = LayoutOf(frame);
  const int shift = 16 - layout.comp[3].depth;
  const int half = (1 << shift) / 2;
  for (int x = 0; x < frame.width; ++x) {
    words[x] = static_cast<std::uint16_t>((words[x] + half) >> shift);
  }
  // av_write_image_line2 sets bits and clears none.
  std::uint8_t* const row = frame.data[3] + std::ptrdiff_t{y} * frame.linesize[3];
  std::fill_n(row, static_cast<std::size_t>(layout.comp[3].step) * frame.width, std::uint8_t{0});
  av_write_image_line2(words, frame.data, frame.linesize, &layout, 0, y, 3, frame.width, 2);
}

// RGB, palette and grey of any integer depth, read component by component, exactly.
template <class Pixel>
void FromComponents(const AVFrame& frame, bool full_range, Pixel* pixels,
                    std::ptrdiff_t row_bytes) {
  const AVPixFmtDescriptor& layout = LayoutOf(frame);
  const bool palette = (layout.flags & AV_PIX_FMT_FLAG_PAL) != 0;
  const bool grey = !palette && layout.nb_components < 3;
  const bool alpha = (layout.flags & AV_PIX_FMT_FLAG_ALPHA) != 0;
  const std::uint8_t* data[4] = {frame.data[0], frame.data[1], frame.data[2], frame.data[3]};
  std::vector<std::uint16_t> lines[4];
  for (auto& line : lines) line.resize(frame.width);
  float black = 0;
  float scale[4] = {1, 1, 1, 1};
  const int components = palette ? 4 : layout.nb_components;
  for (int c = 0; c < components; ++c) {
    const int depth = palette ? 8 : layout.comp[c].depth;
    scale[c] = 1.0f / static_cast<float>((1 << depth) - 1);
    if (frame.format == AV_PIX_FMT_MONOWHITE) {
      black = 1;
      scale[c] = -1;
    } else if (grey && c == 0 && !full_range && depth >= 8) {
      black = static_cast<float>(16 << (depth - 8));
      scale[c] = 1.0f / static_cast<float>(219 << (depth - 8));
    }
  }
  for (int y = 0; y < frame.height; ++y) {
    for (int c = 0; c < components; ++c) {
      av_read_image_line2(lines[c].data(), data, frame.linesize, &layout, 0, y, c, frame.width,
                          palette, 2);
    }
    Pixel* out = Row(pixels, row_bytes, y);
    const int opacity = grey ? 1 : 3;
    for (int x = 0; x < frame.width; ++x) {
      float rgb[3];
      for (int c = 0; c < 3; ++c) {
        const int from = grey ? 0 : c;
        rgb[c] = (static_cast<float>(lines[from][x]) - black) * scale[from];
      }
      out[x] =
          FromUnit<Pixel>(alpha ? static_cast<float>(lines[opacity][x]) * scale[opacity] : 1.0f,
                          rgb[0], rgb[1], rgb[2]);
    }
  }
}

void FromPlanes8(const AVFrame& gbr, bool alpha, HX_Pixel8* pixels, std::ptrdiff_t row_bytes) {
  for (int y = 0; y < gbr.height; ++y) {
    const auto plane = [&](int p) { return gbr.data[p] + std::ptrdiff_t{y} * gbr.linesize[p]; };
    PackPixels({alpha ? plane(3) : nullptr, plane(2), plane(0), plane(1)},
               static_cast<std::size_t>(gbr.width),
               reinterpret_cast<std::uint8_t*>(Row(pixels, row_bytes, y)));
  }
}

// Rotates by quarters clockwise, then swaps left and right if `mirrored`; width, height: of
// `stored`.
template <class Pixel>
void Turn(const Pixel* stored, int width, int height, int rotation, bool mirrored, Pixel* pixels,
          std::ptrdiff_t row_bytes) {
  const int last_x = (rotation % 180 == 0 ? width : height) - 1;
  for (int top = 0; top < height; top += kTurnTile) {
    for (int left = 0; left < width; left += kTurnTile) {
      for (int y = top; y < std::min(top + kTurnTile, height); ++y) {
        for (int x = left; x < std::min(left + kTurnTile, width); ++x) {
          int to_x = x;
          int to_y = y;
          if (rotation == 90) {
            to_x = height - 1 - y;
            to_y = x;
          } else if (rotation == 180) {
            to_x = width - 1 - x;
            to_y = height - 1 - y;
          } else if (rotation == 270) {
            to_x = y;
            to_y = width - 1 - x;
          }
          Row(pixels, row_bytes, to_y)[mirrored ? last_x - to_x : to_x] =
              stored[std::ptrdiff_t{y} * width + x];
        }
      }
    }
  }
}

}  // namespace

void Scaler::Scale(const AVFrame& from, AVFrame& to, const ColourModel& model) {
  const bool by_fields =
      ByFields(model, LayoutOf(from), from.height) || ByFields(model, LayoutOf(to), to.height);
  if (!by_fields || from.height != to.height) {
    ScalePart(from, to, model, 0);
    return;
  }
  for (int parity = 0; parity < 2; ++parity) {
    const FramePtr from_field = FieldOf(from, parity);
    const FramePtr to_field = FieldOf(to, parity);
    ScalePart(*from_field, *to_field, model, 1 + parity);
  }
}

void Scaler::ScalePart(const AVFrame& from, AVFrame& to, const ColourModel& model, int part) {
  const Key key{from.width, from.height,  from.format,  to.width,        to.height,
                to.format,  model.matrix, model.chroma, model.full_range};
  ScalerPtr& context = contexts_[part];
  if (!context || keys_[part] != key) {
    context.reset(NotNull(sws_alloc_context()));
    const auto set = [&](const char* name, std::int64_t value) {
      av_opt_set_int(context.get(), name, value, 0);
    };
    set("srcw", from.width);
    set("srch", from.height);
    set("src_format", WithoutRange(from.format));
    set("dstw", to.width);
    set("dsth", to.height);
    set("dst_format", WithoutRange(to.format));
    set("sws_flags", SWS_BICUBIC | SWS_ACCURATE_RND | SWS_FULL_CHR_H_INT | SWS_FULL_CHR_H_INP);
    // Formats below 8 bits are dithered from row to row, which bands in parallel would break.
    const unsigned processors = std::clamp(std::thread::hardware_concurrency(), 1u, 4u);
    set("threads", LayoutOf(to).comp[0].depth < 8 ? 1 : processors);
    const auto position = [&](const char* across, const char* down, const AVFrame& frame) {
      const AVPixFmtDescriptor& layout = LayoutOf(frame);
      const bool centred = model.chroma == AVCHROMA_LOC_CENTER ||
                           model.chroma == AVCHROMA_LOC_TOP || model.chroma == AVCHROMA_LOC_BOTTOM;
      const bool top = model.chroma == AVCHROMA_LOC_TOPLEFT || model.chroma == AVCHROMA_LOC_TOP;
      const bool bottom =
          model.chroma == AVCHROMA_LOC_BOTTOMLEFT || model.chroma == AVCHROMA_LOC_BOTTOM;
      // In 1/256 of a luma sample.
      const int w = layout.log2_chroma_w;
      if (w > 0) set(across, centred ? (128 << w) - 128 : 0);
      if (layout.log2_chroma_h == 1)
        set(down, part == 1 ? 64 : part == 2 ? 192 : top ? 0 : bottom ? 256 : 128);
    };
    position("src_h_chr_pos", "src_v_chr_pos", from);
    position("dst_h_chr_pos", "dst_v_chr_pos", to);
    const int* coefficients = sws_getCoefficients(SwscaleMatrix(model.matrix));
    // From YUV to YUV code words are only shifted; told that they are full, swscale repeats the
    // upper bits of some planes in the lower ones.
    const auto coded = [](const AVFrame& f) {
      return IsYuv(LayoutOf(f)) || LayoutOf(f).nb_components < 3;
    };
    const bool shifted = coded(from) && coded(to);
    const bool from_full = coded(from) && model.full_range && !shifted;
    const bool to_full = coded(to) ? model.full_range && !shifted : true;
    const auto set_colours = [&] {
      sws_setColorspaceDetails(context.get(), coefficients, from_full, coefficients, to_full, 0,
                               1 << 16, 1 << 16);
    };
    set_colours();  // decides which converters are chosen
    if (sws_init_context(context.get(), nullptr, nullptr) < 0) {
      context.reset();
      throw std::runtime_error(std::string("no conversion from ") + LayoutOf(from).name + " to " +
                               LayoutOf(to).name);
    }
    set_colours();  // some converters take their tables only now
    keys_[part] = key;
  }
  if (sws_scale_frame(context.get(), &to, &from) < 0) throw std::bad_alloc();
}

template <class Pixel>
void FrameToPixels::ConvertStored(const AVFrame& frame, Pixel* pixels, std::ptrdiff_t row_bytes) {
  const AVPixFmtDescriptor& layout = LayoutOf(frame);
  ColourModel model =
      ModelOf(TagsOf(frame), static_cast<AVPixelFormat>(frame.format), info_.width, info_.height);
  model.fields = frame.interlaced_frame != 0;
  const bool alpha = (layout.flags & AV_PIX_FMT_FLAG_ALPHA) != 0;
  if (!IsYuv(layout)) {
    const bool odd = (layout.flags & (AV_PIX_FMT_FLAG_FLOAT | AV_PIX_FMT_FLAG_BAYER)) ||
                     std::strncmp(layout.name, "xyz", 3) == 0;
    if (odd) {
      AVFrame& rgb = Reuse(planes_, AV_PIX_FMT_RGBA64, frame.width, frame.height);
      scaler_.Scale(frame, rgb, model);
      FromComponents(rgb, true, pixels, row_bytes);
    } else {
      FromComponents(frame, model.full_range, pixels, row_bytes);
    }
    return;
  }
  if constexpr (std::is_same_v<Pixel, HX_Pixel8>) {
    if (PlanarYuv::Takes(static_cast<AVPixelFormat>(frame.format), frame.width, frame.height)) {
      planar_.ToPixels(frame, model, pixels, row_bytes);
      return;
    }
    AVFrame& planes =
        Reuse(planes_, alpha ? AV_PIX_FMT_GBRAP : AV_PIX_FMT_GBRP, frame.width, frame.height);
    scaler_.Scale(frame, planes, model);
    FromPlanes8(planes, alpha, pixels, row_bytes);
  } else {
    AVFrame& planes = Reuse(planes_, AV_PIX_FMT_YUV444P16, frame.width, frame.height);
    scaler_.Scale(frame, planes, model);
    const DeepYuv yuv(model, layout.comp[0].depth);
    std::vector<std::uint16_t> opacity(alpha ? static_cast<std::size_t>(frame.width) : 0);
    for (int y = 0; y < frame.height; ++y) {
      if (alpha) ReadAlpha(frame, y, opacity.data());
      yuv.ToPixels({Row16(planes, 0, y), Row16(planes, 1, y), Row16(planes, 2, y),
                    alpha ? opacity.data() : nullptr},
                   static_cast<std::size_t>(frame.width), Row(pixels, row_bytes, y));
    }
  }
}

template <class Pixel>
void FrameToPixels::Convert(const AVFrame& frame, Pixel* pixels, std::ptrdiff_t row_bytes) {
  const bool sideways = info_.rotation % 180 != 0;
  const int width = sideways ? info_.height : info_.width;
  const int height = sideways ? info_.width : info_.height;
  const AVFrame* fitting = &frame;
  if (frame.width != width || frame.height != height) {
    // A stream may change its size on the way; the clip's is that of its first frame.
    AVFrame& resized = Reuse(resized_, frame.format, width, height);
    resizer_.Scale(frame, resized, ColourModel{});
    av_frame_copy_props(&resized, &frame);
    fitting = &resized;
  }
  if (info_.rotation == 0 && !info_.mirrored) {
    ConvertStored(*fitting, pixels, row_bytes);
    return;
  }
  turned_.resize(sizeof(Pixel) * static_cast<std::size_t>(width) * height);
  auto* stored = reinterpret_cast<Pixel*>(turned_.data());
  ConvertStored(*fitting, stored, static_cast<std::ptrdiff_t>(sizeof(Pixel)) * width);
  Turn(stored, width, height, info_.rotation, info_.mirrored, pixels, row_bytes);
}

template <class Pixel>
FramePtr PixelsToFrame::Convert(const Pixel* pixels, std::ptrdiff_t row_bytes) {
  // The last frame's memory serves again, unless the encoder still reads it.
  if (!last_ || av_frame_is_writable(last_.get()) <= 0) {
    last_ = NewPicture(format_, width_, height_);
  }
  FramePtr frame(NotNull(av_frame_clone(last_.get())));
  const AVPixFmtDescriptor& layout = LayoutOf(*frame);
  const bool alpha = (layout.flags & AV_PIX_FMT_FLAG_ALPHA) != 0;
  const bool rgb = (layout.flags & AV_PIX_FMT_FLAG_RGB) != 0;
  const auto opacity = [&](const Pixel& pixel) {
    return alpha ? 1.0f : static_cast<float>(pixel.alpha) * kUnit<Pixel>;
  };
  if (rgb && layout.comp[0].depth >= 8 && layout.comp[0].depth <= 16) {
    // av_write_image_line2 sets bits and clears none.
    for (const AVBufferRef* buffer : frame->buf) {
      if (buffer) std::memset(buffer->data, 0, buffer->size);
    }
    std::vector<std::uint16_t> line(width_);
    for (int y = 0; y < height_; ++y) {
      const Pixel* in = Row(pixels, row_bytes, y);
      for (int c = 0; c < layout.nb_components; ++c) {
        const auto top = static_cast<float>((1 << layout.comp[c].depth) - 1);
        for (int x = 0; x < width_; ++x) {
          const auto values = {in[x].red, in[x].green, in[x].blue, in[x].alpha};
          const float value = static_cast<float>(values.begin()[c]) * kUnit<Pixel> *
                              (c < 3 ? opacity(in[x]) : 1.0f);
          line[x] = static_cast<std::uint16_t>(std::min(std::max(value, 0.0f), 1.0f) * top + 0.5f);
        }
        av_write_image_line2(line.data(), frame->data, frame->linesize, &layout, 0, y, c, width_,
                             2);
      }
    }
    return frame;
  }
  if constexpr (std::is_same_v<Pixel, HX_Pixel8>) {
    if (PlanarYuv::Takes(format_, width_, height_)) {
      planar_.FromPixels(pixels, row_bytes, model_, *frame);
      return frame;
    }
  }
  if (std::is_same_v<Pixel, HX_Pixel8> || rgb) {
    AVFrame& argb = Reuse(planes_, AV_PIX_FMT_ARGB, width_, height_);
    for (int y = 0; y < height_; ++y) {
      const Pixel* in = Row(pixels, row_bytes, y);
      auto* out = Row(reinterpret_cast<HX_Pixel8*>(argb.data[0]), argb.linesize[0], y);
      if constexpr (std::is_same_v<Pixel, HX_Pixel8>) {
        std::memcpy(out, in, sizeof(Pixel) * static_cast<std::size_t>(width_));
        if (alpha) continue;
        for (int x = 0; x < width_; ++x) {
          const int a = out[x].alpha;
          const auto over_black = [a](int value) {
            return static_cast<std::uint8_t>((value * a + 127) / 255);
          };
          out[x] = {255, over_black(out[x].red), over_black(out[x].green), over_black(out[x].blue)};
        }
      } else {
        for (int x = 0; x < width_; ++x) {
          const float gain = opacity(in[x]) * kUnit<Pixel>;
          out[x] = FromUnit<HX_Pixel8>(
              static_cast<float>(in[x].alpha) * kUnit<Pixel>, static_cast<float>(in[x].red) * gain,
              static_cast<float>(in[x].green) * gain, static_cast<float>(in[x].blue) * gain);
        }
      }
    }
    scaler_.Scale(argb, *frame, model_);
    return frame;
  }
  if constexpr (!std::is_same_v<Pixel, HX_Pixel8>) {
    // Alpha in a plane of its own is written here, other alpha by swscale.
    const bool own_plane = alpha && layout.comp[3].plane == 3;
    AVFrame& planes =
        Reuse(planes_, alpha && !own_plane ? AV_PIX_FMT_YUVA444P16 : AV_PIX_FMT_YUV444P16, width_,
              height_);
    const DeepYuv yuv(model_, std::min(layout.comp[0].depth, 16));
    std::vector<std::uint16_t> words(own_plane ? static_cast<std::size_t>(width_ * height_) : 0);
    const auto words_of = [&](int y) { return words.data() + std::ptrdiff_t{y} * width_; };
    for (int y = 0; y < height_; ++y) {
      yuv.FromPixels(Row(pixels, row_bytes, y), static_cast<std::size_t>(width_),
                     {Row16(planes, 0, y), Row16(planes, 1, y), Row16(planes, 2, y),
                      own_plane ? words_of(y) : Row16(planes, 3, y)});
    }
    scaler_.Scale(planes, *frame, model_);
    for (int y = 0; own_plane && y < height_; ++y) WriteAlpha(words_of(y), y, *frame);
  }
  return frame;
}

template void FrameToPixels::Convert(const AVFrame&, HX_Pixel8*, std::ptrdiff_t);
template void FrameToPixels::Convert(const AVFrame&, HX_Pixel16*, std::ptrdiff_t);
template void FrameToPixels::Convert(const AVFrame&, HX_PixelFloat*, std::ptrdiff_t);
template FramePtr PixelsToFrame::Convert(const HX_Pixel8*, std::ptrdiff_t);
template FramePtr PixelsToFrame::Convert(const HX_Pixel16*, std::ptrdiff_t);
template FramePtr PixelsToFrame::Convert(const HX_PixelFloat*, std::ptrdiff_t);

}  // namespace calmframe::media
