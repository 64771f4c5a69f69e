#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "host/media/ffmpeg.h"
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
  // Throws Failure (output): an unknown codec (naming the nearest), a pixel format that the encoder
  // lacks, a setting that it refuses. `shown`: the path in the messages.
  Encoder(const std::string& shown, const AVOutputFormat& format, const ClipInfo& source, int width,
          int height, const EncodeSettings& settings, std::vector<std::string>& warnings);

  const AVCodecContext& context() const { return *codec_; }
  const ColourModel& colour() const { return model_; }
  AVRational time_base() const { return clock_; }

  // Null ends the stream.
  void Send(std::size_t number, FramePtr frame);
  // The next packet in time_base() ticks, null if it needs another frame or at the end.
  PacketPtr Receive();
  FrameTime TimeOf(std::size_t number) const;

 private:
  bool Open(const AVCodec& codec, const AVOutputFormat& format, const ClipInfo& source,
            const EncodeSettings& settings, AVPixelFormat pixel_format, int& error);

  const std::string shown_;
  const ClipInfo source_;
  const int width_;
  const int height_;
  CodecPtr codec_;
  ColourModel model_;
  bool even_times_ = false;  // the container has one rate: a frame's time is its number
  bool by_number_ = false;   // the encoder's clock counts frames, none is reordered
  AVRational clock_{1, 25};
  std::map<std::int64_t, std::size_t> numbers_;  // by time stamp, of frames not yet encoded
};

}  // namespace calmframe::media
