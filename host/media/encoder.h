#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "host/media/encoder_options.h"
#include "host/media/ffmpeg.h"
#include "host/media/hardware_frames.h"
#include "host/media/pixel_conversion.h"

namespace calmframe::media {

// The container for a pipe: raw frames (YUV4MPEG2), or of a codec that is asked for Matroska, or
// NUT where that doesn't take it.
const AVOutputFormat* FormatForPipe(const EncodeSettings& settings);

// Containers that state one frame rate in place of a time for each frame.
bool HasOneRate(const AVOutputFormat& format);

// The video encoder of a written clip, and the clock of its packets.
class Encoder {
 public:
  // Throws Failure (output): an unknown codec (naming the nearest), a pixel format or an option
  // that the encoder lacks, a setting that it refuses, a device that isn't there. `shown`: the path
  // in the messages.
  Encoder(const std::string& shown, const AVOutputFormat& format, const ClipInfo& source, int width,
          int height, const EncodeSettings& settings, std::vector<std::string>& warnings);

  ~Encoder();
  Encoder(const Encoder&) = delete;
  Encoder& operator=(const Encoder&) = delete;

  const AVCodecContext& context() const { return *codec_; }
  const ColourModel& colour() const { return model_; }
  // Of the frames that are sent.
  AVPixelFormat pixel_format() const { return pixel_format_; }
  AVRational time_base() const { return clock_; }

  // In memory; null ends the stream. Throws Failure (output).
  void Send(std::size_t number, FramePtr frame);
  // The next packet in time_base() ticks, null if it needs another frame or at the end.
  PacketPtr Receive();
  FrameTime TimeOf(std::size_t number) const;

 private:
  bool Open(const AVCodec& codec, const AVOutputFormat& format, const ClipInfo& source,
            const EncodeSettings& settings, std::string& cause);
  void Close() noexcept;
  void SetQuality(const AVCodec& codec, int crf);

  const std::string shown_;
  const ClipInfo source_;
  const int width_;
  const int height_;
  std::unique_ptr<HardwareFrames> device_;  // null: the encoder takes frames from memory
  std::vector<EncoderOption> options_;
  AVPixelFormat pixel_format_ = AV_PIX_FMT_NONE;
  CodecPtr codec_;
  ColourModel model_;
  bool even_times_ = false;  // the container has one rate: a frame's time is its number
  bool has_begun_ = false;   // a frame was sent
  bool by_number_ = false;   // the encoder's clock counts frames, none is reordered
  AVRational clock_{1, 25};
  std::map<std::int64_t, std::size_t> numbers_;  // by time stamp, of frames not yet encoded
};

}  // namespace calmframe::media
