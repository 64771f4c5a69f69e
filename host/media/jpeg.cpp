#include "host/media/jpeg.h"

#include <algorithm>
#include <cstring>
#include <stdexcept>

#include "host/media/ffmpeg.h"

namespace calmframe::media {

struct JpegEncoder::State {
  CodecPtr codec;
  FramePtr frame;
  ScalerPtr scaler;
  std::vector<HX_Pixel8> flat;  // a picture over black
};

namespace {

// What no picture covers is black, whatever colour it has there. Most pictures cover all: the copy
// is made for the others alone.
PictureView OverBlack(const PictureView& picture, std::vector<HX_Pixel8>& flat) {
  const auto row_of = [&](int y) {
    return reinterpret_cast<const HX_Pixel8*>(
        reinterpret_cast<const std::uint8_t*>(picture.pixels) + y * picture.row_bytes);
  };
  const auto covers = [&](int y) {
    unsigned all = 255;
    for (int x = 0; x < picture.width; ++x) all &= row_of(y)[x].alpha;
    return all == 255;
  };
  int y = 0;
  while (y < picture.height && covers(y)) ++y;
  if (y == picture.height) return picture;
  flat.resize(static_cast<std::size_t>(picture.width) * static_cast<std::size_t>(picture.height));
  for (y = 0; y < picture.height; ++y) {
    HX_Pixel8* const to = flat.data() + std::ptrdiff_t{y} * picture.width;
    for (int x = 0; x < picture.width; ++x) {
      const HX_Pixel8 from = row_of(y)[x];
      const auto over = [&](std::uint8_t part) {
        return static_cast<std::uint8_t>((part * from.alpha + 127) / 255);
      };
      to[x] = {255, over(from.red), over(from.green), over(from.blue)};
    }
  }
  return {flat.data(), picture.width * static_cast<std::ptrdiff_t>(sizeof(HX_Pixel8)),
          picture.width, picture.height};
}

CodecPtr OpenCodec(int width, int height, int quantizer) {
  const AVCodec* codec = avcodec_find_encoder(AV_CODEC_ID_MJPEG);
  if (!codec) throw std::runtime_error("FFmpeg has no JPEG encoder");
  CodecPtr context(NotNull(avcodec_alloc_context3(codec)));
  context->width = width;
  context->height = height;
  context->pix_fmt = AV_PIX_FMT_YUVJ420P;
  context->time_base = {1, 25};
  context->flags |= AV_CODEC_FLAG_QSCALE;
  context->global_quality = FF_QP2LAMBDA * quantizer;
  context->thread_count = 1;
  // Tables of its own for each picture take a second pass over it.
  av_opt_set(context->priv_data, "huffman", "default", 0);
  if (avcodec_open2(context.get(), codec, nullptr) < 0) throw std::bad_alloc();
  return context;
}

}  // namespace

JpegEncoder::JpegEncoder() : state_(std::make_unique<State>()) {}
JpegEncoder::~JpegEncoder() = default;

std::string JpegEncoder::Encode(const std::vector<PictureView>& pictures, int width, int height,
                                int quantizer) {
  width = std::max(width, 2);
  height = std::max(height & ~1, 2);  // so that chroma rows of one picture aren't those of another
  const int all = height * static_cast<int>(pictures.size());
  CodecPtr& codec = state_->codec;
  if (!codec || codec->width != width || codec->height != all ||
      codec->global_quality != FF_QP2LAMBDA * quantizer) {
    codec = OpenCodec(width, all, quantizer);
    state_->frame = NewPicture(AV_PIX_FMT_YUVJ420P, width, all);
  }
  AVFrame& frame = *state_->frame;
  frame.quality = codec->global_quality;
  if (av_frame_make_writable(&frame) < 0) throw std::bad_alloc();
  for (std::size_t p = 0; p < pictures.size(); ++p) {
    const PictureView picture = OverBlack(pictures[p], state_->flat);
    // The quick way leaves out pixels of what is made much smaller.
    state_->scaler.reset(NotNull(sws_getCachedContext(
        state_->scaler.release(), picture.width, picture.height, AV_PIX_FMT_ARGB, width, height,
        AV_PIX_FMT_YUV420P, picture.width > 2 * width ? SWS_AREA : SWS_FAST_BILINEAR, nullptr,
        nullptr, nullptr)));
    // As JFIF has it: BT.601 in full range.
    const int* const bt601 = sws_getCoefficients(SWS_CS_ITU601);
    constexpr int kFull = 1, kUnit = 1 << 16;
    sws_setColorspaceDetails(state_->scaler.get(), bt601, kFull, bt601, kFull, 0, kUnit, kUnit);
    const std::uint8_t* const from[] = {reinterpret_cast<const std::uint8_t*>(picture.pixels)};
    const int from_rows[] = {static_cast<int>(picture.row_bytes)};
    std::uint8_t* to[3];
    for (int plane = 0; plane < 3; ++plane) {
      const std::ptrdiff_t top = static_cast<std::ptrdiff_t>(p) * height / (plane == 0 ? 1 : 2);
      to[plane] = frame.data[plane] + top * frame.linesize[plane];
    }
    sws_scale(state_->scaler.get(), from, from_rows, 0, picture.height, to, frame.linesize);
  }
  const PacketPtr packet = NewPacket();
  if (avcodec_send_frame(codec.get(), &frame) < 0 ||
      avcodec_receive_packet(codec.get(), packet.get()) < 0) {
    codec.reset();
    throw std::bad_alloc();
  }
  return {reinterpret_cast<const char*>(packet->data), static_cast<std::size_t>(packet->size)};
}

}  // namespace calmframe::media
