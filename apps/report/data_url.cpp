#include "apps/report/data_url.h"

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavutil/base64.h>
}

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <memory>
#include <new>
#include <stdexcept>
#include <vector>

namespace calmframe::report {
namespace {

// Quantizer of the encoder, 1 (best) to 31: about 85 on the scale that other programs have.
constexpr int kQuantizer = 3;

struct FreeContext {
  void operator()(AVCodecContext* context) const { avcodec_free_context(&context); }
};
struct FreeFrame {
  void operator()(AVFrame* frame) const { av_frame_free(&frame); }
};
struct FreePacket {
  void operator()(AVPacket* packet) const { av_packet_free(&packet); }
};

// Ends of the source pixels under each of `count` output pixels, at least one each.
std::vector<int> Ends(int size, int count) {
  std::vector<int> ends(static_cast<std::size_t>(count));
  for (int i = 0; i < count; ++i) {
    const auto end = static_cast<int>(std::int64_t{size} * (i + 1) / count);
    ends[static_cast<std::size_t>(i)] = std::max(end, 1);
  }
  return ends;
}

using Colour = std::array<double, 3>;  // red, green, blue; 0 to 255

Colour MeanOf(const PictureView& picture, int left, int right, int top, int bottom) {
  std::array<std::uint64_t, 3> sums{};  // times alpha
  for (int y = top; y < bottom; ++y) {
    const auto* row = reinterpret_cast<const HX_Pixel8*>(
        reinterpret_cast<const std::uint8_t*>(picture.pixels) + y * picture.row_bytes);
    for (int x = left; x < right; ++x) {
      const std::uint32_t alpha = row[x].alpha;
      sums[0] += alpha * row[x].red;
      sums[1] += alpha * row[x].green;
      sums[2] += alpha * row[x].blue;
    }
  }
  const double unit = 255.0 * (right - left) * (bottom - top);
  return {static_cast<double>(sums[0]) / unit, static_cast<double>(sums[1]) / unit,
          static_cast<double>(sums[2]) / unit};
}

// As JFIF has it: BT.601 in full range.
std::array<std::uint8_t, 3> YCbCrOf(const Colour& colour) {
  const auto [red, green, blue] = colour;
  const double luma = 0.299 * red + 0.587 * green + 0.114 * blue;
  const auto byte = [](double value) {
    return static_cast<std::uint8_t>(std::clamp(std::lround(value), 0L, 255L));
  };
  return {byte(luma), byte(128 + (blue - luma) / 1.772), byte(128 + (red - luma) / 1.402)};
}

std::string Base64Of(const AVPacket& packet) {
  std::string text(AV_BASE64_SIZE(static_cast<std::size_t>(packet.size)), '\0');
  if (!av_base64_encode(text.data(), static_cast<int>(text.size()), packet.data, packet.size)) {
    throw std::bad_alloc();
  }
  text.pop_back();  // the terminating zero
  return text;
}

}  // namespace

std::string DataUrlOf(const PictureView& picture, int width) {
  width = std::clamp(width, 1, picture.width);
  const double shape = picture.width * picture.pixel_aspect / picture.height;
  const int height = std::clamp(static_cast<int>(std::lround(width / shape)), 1, picture.height);

  const AVCodec* codec = avcodec_find_encoder(AV_CODEC_ID_MJPEG);
  if (!codec) throw std::runtime_error("FFmpeg has no JPEG encoder");
  const std::unique_ptr<AVCodecContext, FreeContext> context(avcodec_alloc_context3(codec));
  const std::unique_ptr<AVFrame, FreeFrame> frame(av_frame_alloc());
  const std::unique_ptr<AVPacket, FreePacket> packet(av_packet_alloc());
  if (!context || !frame || !packet) throw std::bad_alloc();
  context->width = frame->width = width;
  context->height = frame->height = height;
  context->pix_fmt = AV_PIX_FMT_YUVJ444P;
  frame->format = AV_PIX_FMT_YUVJ444P;
  context->time_base = {1, 25};
  context->flags |= AV_CODEC_FLAG_QSCALE;
  context->global_quality = frame->quality = FF_QP2LAMBDA * kQuantizer;
  if (avcodec_open2(context.get(), codec, nullptr) < 0 || av_frame_get_buffer(frame.get(), 0) < 0) {
    throw std::bad_alloc();
  }

  const std::vector<int> columns = Ends(picture.width, width);
  const std::vector<int> rows = Ends(picture.height, height);
  int top = 0;
  for (int y = 0; y < height; ++y) {
    const int bottom = rows[static_cast<std::size_t>(y)];
    int left = 0;
    for (int x = 0; x < width; ++x) {
      const int right = columns[static_cast<std::size_t>(x)];
      const auto parts = YCbCrOf(MeanOf(picture, left, right, top, bottom));
      for (std::size_t plane = 0; plane < parts.size(); ++plane) {
        frame->data[plane][std::ptrdiff_t{y} * frame->linesize[plane] + x] = parts[plane];
      }
      left = right;
    }
    top = bottom;
  }
  if (avcodec_send_frame(context.get(), frame.get()) < 0 ||
      avcodec_receive_packet(context.get(), packet.get()) < 0) {
    throw std::bad_alloc();
  }
  return "data:image/jpeg;base64," + Base64Of(*packet);
}

}  // namespace calmframe::report
