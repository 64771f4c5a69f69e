#pragma once

#include <atomic>
#include <cstdint>
#include <string>

#include "host/media/ffmpeg.h"

namespace calmframe::media {

// More pixels than any camera's frame has, few enough for a frame of floats to fit in memory.
constexpr std::int64_t kMaximumPixels = std::int64_t{1} << 27;

// Opens a clip for reading its packets. Only what FilesOf tells of it is read, whatever its
// contents point to. Throws Failure (input).
InputPtr OpenInput(const std::string& path);

// The video of a clip that is steadied, of a size that can be. Throws Failure (input).
AVStream& VideoStreamOf(const AVFormatContext& container, const std::string& path);

// Frames of a file's first video stream in the order shown. What is damaged is skipped and counted.
class Decoder {
 public:
  // threads: 0 as many as there are processors. Throws Failure (input).
  explicit Decoder(const std::string& path, int threads = 0);

  // The next frame, null at the end of the stream.
  FramePtr Next();

  // Continues at a frame near and, where the container is able to, not after the one at `pts`.
  bool Seek(std::int64_t pts);
  // Continues at the first frame, on the same road as a new decoder.
  void Rewind();

  const AVFormatContext& container() const { return *container_; }
  const AVStream& stream() const { return *stream_; }
  // Packets or frames that were not whole, so far. With several threads it may miss some: a frame
  // is handed out while what is missing in it is still being made up, and marked too late.
  int damage() const { return damage_; }
  // Whether the decoder found anything worth a word, which misses nothing once the stream has
  // ended.
  bool complained() const { return complaints_ > 0; }
  // End of the last packet of any stream read so far, in AV_TIME_BASE ticks.
  std::int64_t last_time() const { return last_time_; }

 private:
  void Open();
  bool Feed();

  const std::string path_;
  const int threads_;
  std::atomic<int> complaints_ = 0;  // counted by all of the codec's threads
  InputPtr container_;
  AVStream* stream_ = nullptr;
  CodecPtr codec_;
  PacketPtr packet_;
  bool draining_ = false;
  int damage_ = 0;
  int errors_in_a_row_ = 0;
  std::int64_t last_time_ = INT64_MIN;
};

}  // namespace calmframe::media
