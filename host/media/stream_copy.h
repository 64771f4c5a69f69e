#pragma once

#include <map>
#include <string>
#include <vector>

#include "host/media/ffmpeg.h"

namespace calmframe::media {

// Everything of a source file but its steadied video stream, on its way into another file.
class StreamCopy {
 public:
  // Adds to `output`, which holds the video stream and no header yet, every stream that its
  // container takes, the chapters and the metadata; names what is left out in `warnings`.
  StreamCopy(const ClipInfo& source, const std::string& shown, AVFormatContext& output,
             std::vector<std::string>& warnings);

  // Taken from the source's time stamps, in AV_TIME_BASE ticks.
  std::int64_t offset() const { return offset_; }

  // The next packet with its stream and times in `output`, null at the end.
  PacketPtr Next();
  // Time of the last packet that Next gave, in AV_TIME_BASE ticks of the output.
  std::int64_t time() const { return time_; }

 private:
  void CopyVideoProperties(const AVStream& from, AVStream& to);
  void CopyChapters();

  InputPtr input_;
  AVFormatContext& output_;
  std::int64_t offset_ = 0;
  std::int64_t time_ = INT64_MIN;
  std::map<int, int> to_;                 // output stream by input stream
  std::map<int, std::int64_t> last_dts_;  // by output stream
};

}  // namespace calmframe::media
