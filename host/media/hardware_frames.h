#pragma once

#include <memory>
#include <string>
#include <vector>

#include "host/media/ffmpeg.h"

namespace calmframe::media {

// Frames on a device, for encoders that take none from memory (VAAPI's).
class HardwareFrames {
 public:
  // Null for an encoder that takes frames from memory, whatever it runs on. Throws
  // std::invalid_argument: one line, the device is not there.
  static std::unique_ptr<HardwareFrames> For(const AVCodec& codec);

  // What can be brought to the device.
  std::vector<AVPixelFormat> Formats() const;
  // Before the encoder is opened, its size being set: it takes frames of the device, which hold
  // what memory has in `format`, one of Formats(). Throws std::invalid_argument.
  void LendTo(AVCodecContext& encoder, AVPixelFormat format) const;
  // A frame in memory as one of the device, with its times and tags. Throws std::runtime_error.
  static FramePtr Upload(const AVCodecContext& encoder, const AVFrame& frame);

 private:
  struct Unreference {
    void operator()(AVBufferRef* reference) const { av_buffer_unref(&reference); }
  };
  HardwareFrames() = default;

  AVPixelFormat format_ = AV_PIX_FMT_NONE;  // of its frames as the encoder sees them
  std::unique_ptr<AVBufferRef, Unreference> device_;
};

// What a person is told who asks for an encoder that runs on a device and that FFmpeg here lacks;
// empty for any other name.
std::string LackedHardware(const std::string& encoder);

}  // namespace calmframe::media
