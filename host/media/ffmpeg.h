#pragma once

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavformat/avformat.h>
#include <libavutil/avutil.h>
#include <libavutil/display.h>
#include <libavutil/frame.h>
#include <libavutil/imgutils.h>
#include <libavutil/mathematics.h>
#include <libavutil/opt.h>
#include <libavutil/pixdesc.h>
#include <libavutil/timecode.h>
#include <libswscale/swscale.h>
}

#include <cstdint>
#include <memory>
#include <new>
#include <string>

#include "host/media/clip.h"

// Ownership of FFmpeg's objects. FFmpeg's own log is silenced where a file is opened.
namespace calmframe::media {

struct FfmpegDelete {
  void operator()(AVFrame* frame) const { av_frame_free(&frame); }
  void operator()(AVPacket* packet) const { av_packet_free(&packet); }
  void operator()(AVCodecContext* codec) const { avcodec_free_context(&codec); }
  void operator()(SwsContext* scaler) const { sws_freeContext(scaler); }
};
using FramePtr = std::unique_ptr<AVFrame, FfmpegDelete>;
using PacketPtr = std::unique_ptr<AVPacket, FfmpegDelete>;
using CodecPtr = std::unique_ptr<AVCodecContext, FfmpegDelete>;
using ScalerPtr = std::unique_ptr<SwsContext, FfmpegDelete>;

struct InputDelete {
  void operator()(AVFormatContext* container) const { avformat_close_input(&container); }
};
using InputPtr = std::unique_ptr<AVFormatContext, InputDelete>;

template <class T>
T* NotNull(T* pointer) {
  if (!pointer) throw std::bad_alloc();
  return pointer;
}
inline FramePtr NewFrame() {
  return FramePtr(NotNull(av_frame_alloc()));
}
// With memory of its own, every row aligned to 64 bytes for any vectors.
inline FramePtr NewPicture(int format, int width, int height) {
  FramePtr frame = NewFrame();
  frame->format = format;
  frame->width = width;
  frame->height = height;
  if (av_frame_get_buffer(frame.get(), 64) < 0) throw std::bad_alloc();
  return frame;
}
inline PacketPtr NewPacket() {
  return PacketPtr(NotNull(av_packet_alloc()));
}

// A packet's or frame's time. One beyond any clock is none, which leaves room for sums and
// differences of times: 2^60 ns are 36 years.
inline std::int64_t TimeOrNone(std::int64_t ticks) {
  constexpr std::int64_t kLatest = std::int64_t{1} << 60;
  return ticks >= -kLatest && ticks <= kLatest ? ticks : AV_NOPTS_VALUE;
}

inline std::string ErrorText(int error) {
  char text[AV_ERROR_MAX_STRING_SIZE] = {};
  av_strerror(error, text, sizeof text);
  return text;
}

inline AVRational ToRational(Ratio ratio) {
  int num = 1;
  int den = 1;
  av_reduce(&num, &den, ratio.num, ratio.den, INT32_MAX);
  return {num, den};
}

inline Ratio ToRatio(AVRational rational) {
  return {rational.num, rational.den};
}

}  // namespace calmframe::media
