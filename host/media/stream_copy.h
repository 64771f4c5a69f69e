#pragma once

#include <cstdint>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "host/media/ffmpeg.h"

namespace calmframe::media {

// The tag of a stream's codec in another container: its own where that knows it, else 0, for the
// muxer to find.
std::uint32_t TagFor(const AVOutputFormat& format, const AVCodecParameters& parameters);

// Everything of a source file but its steadied video stream, on its way into another file.
class StreamCopy {
 public:
  // Adds to `output`, which holds the video stream and no header yet, every stream that its
  // container takes, the chapters and the metadata; names what is left out in `warnings`. Of a part
  // it is what lies within it, counted from its first frame; see ClipWriter. Throws Failure where
  // the source can't be opened any more.
  StreamCopy(const ClipInfo& source, const std::string& shown, AVFormatContext& output,
             std::vector<std::string>& warnings);

  // To be taken from the video's time stamps, in AV_TIME_BASE ticks.
  std::int64_t offset() const { return cut_ ? 0 : offset_.In(AV_TIME_BASE_Q); }

  // The next packet with its stream and times in `output`, null at the end.
  PacketPtr Next();
  // FFmpeg's number for why that came early; 0 where it did not.
  int error() const { return error_; }
  // Time of the last packet that Next gave, in AV_TIME_BASE ticks of the output.
  std::int64_t time() const { return time_; }

 private:
  struct Time {
    std::int64_t ticks = 0;
    AVRational base = AV_TIME_BASE_Q;
    std::int64_t In(AVRational other) const { return av_rescale_q(ticks, base, other); }
  };

  void CopyVideoProperties(const AVStream& from, AVStream& to);
  void CopyChapters();
  // Of a packet whose times count from the part's first frame: cuts it to the part as far as its
  // kind can be cut; false where nothing of it is left.
  bool Cut(const AVStream& from, AVPacket& packet);

  InputPtr input_;
  AVFormatContext& output_;
  Time offset_;  // taken from the source's time stamps
  bool cut_ = false;
  Time length_;          // of the part
  std::set<int> begun_;  // input streams of which a packet lies in the part
  std::int64_t time_ = INT64_MIN;
  int error_ = 0;
  std::map<int, int> to_;                 // output stream by input stream
  std::map<int, std::int64_t> last_dts_;  // by output stream
};

}  // namespace calmframe::media
