#include "host/media/segment_join.h"

#include <algorithm>
#include <cstring>
#include <numeric>
#include <utility>

#include "host/media/clip_container.h"
#include "host/media/clip_files.h"
#include "host/media/decoder.h"
#include "host/media/encoder.h"
#include "host/media/output_choice.h"

namespace calmframe::media {
namespace {

// A segment's video packets, in the order that they are decoded in.
class Segment {
 public:
  explicit Segment(const std::string& path) : path_(path), input_(OpenInput(path)) {
    stream_ = av_find_best_stream(input_.get(), AVMEDIA_TYPE_VIDEO, -1, -1, nullptr, 0);
    if (stream_ < 0) Fail("holds no video");
  }

  [[noreturn]] void Fail(const std::string& cause) const {
    throw Failure(Failure::Side::input, path_ + ": " + cause);
  }

  const AVCodecParameters& parameters() const { return *input_->streams[stream_]->codecpar; }

  // Null at the end.
  PacketPtr Next() {
    PacketPtr packet = NewPacket();
    int error = 0;
    while ((error = av_read_frame(input_.get(), packet.get())) >= 0) {
      if (packet->flags & AV_PKT_FLAG_CORRUPT) Fail("is damaged");
      if (packet->stream_index == stream_) return packet;
      av_packet_unref(packet.get());
    }
    if (error != AVERROR_EOF) Fail("can't be read: " + ErrorText(error));
    return nullptr;
  }

 private:
  const std::string path_;
  InputPtr input_;
  int stream_ = -1;
};

// Which of a segment's frames each of its packets shows, in the order of the packets.
std::vector<std::size_t> ShownPlaces(Segment& segment) {
  std::vector<std::int64_t> times;
  while (const PacketPtr packet = segment.Next()) {
    // Containers without times for pictures hold them in the order that they are shown in.
    times.push_back(packet->pts != AV_NOPTS_VALUE   ? packet->pts
                    : packet->dts != AV_NOPTS_VALUE ? packet->dts
                    : times.empty()                 ? 0
                                                    : times.back() + 1);
  }
  if (times.empty()) segment.Fail("holds no frame");
  std::vector<std::size_t> shown(times.size()), places(times.size());
  std::iota(shown.begin(), shown.end(), std::size_t{0});
  std::stable_sort(shown.begin(), shown.end(),
                   [&](std::size_t a, std::size_t b) { return times[a] < times[b]; });
  for (std::size_t place = 0; place < shown.size(); ++place) places[shown[place]] = place;
  return places;
}

bool Equal(const AVCodecParameters& a, const AVCodecParameters& b) {
  return a.codec_id == b.codec_id && a.width == b.width && a.height == b.height &&
         a.format == b.format && a.extradata_size == b.extradata_size &&
         (a.extradata_size == 0 ||
          std::memcmp(a.extradata, b.extradata, static_cast<std::size_t>(a.extradata_size)) == 0);
}

}  // namespace

std::vector<std::string> JoinSegments(const std::vector<std::string>& segments,
                                      const ClipInfo& source, const std::string& output,
                                      bool overwrite,
                                      const std::function<void(std::size_t)>& goes_on) {
  std::vector<std::string> warnings;
  ClipContainer container(output, source,
                          {.codec = {}, .pixel_format = {}, .overwrite = overwrite});
  if (container.to_pipe() || !container.picture_codec().empty()) {
    container.Fail("raw frames and pictures have no segments to be joined");
  }
  std::vector<std::vector<std::size_t>> places;
  std::size_t frames = 0, delay = 0;
  const Segment head(segments.at(0));
  for (const std::string& path : segments) {
    Segment segment(path);
    if (!Equal(segment.parameters(), head.parameters())) {
      segment.Fail("was encoded by other settings than " + segments[0]);
    }
    places.push_back(ShownPlaces(segment));
    frames += places.back().size();
    for (std::size_t i = 0; i < places.back().size(); ++i) {
      if (places.back()[i] < i) delay = std::max(delay, i - places.back()[i]);
    }
  }
  if (frames != source.frame_count) {
    throw Failure(Failure::Side::input, "the segments hold " + std::to_string(frames) +
                                            " frames, the clip " +
                                            std::to_string(source.frame_count));
  }

  // The first `delay` packets are decoded before the first frame is shown.
  const bool counts = HasOneRate(container.format()) || source.times.empty();
  const AVRational clock =
      counts ? av_inv_q(ToRational(source.frame_rate)) : ToRational(source.time_base);
  const auto time_of = [&](std::size_t frame) {
    if (counts) return FrameTime{static_cast<std::int64_t>(frame), 1};
    return source.times[frame];
  };
  const auto decoded_at = [&](std::size_t packet) {
    if (packet >= delay) return time_of(packet - delay).pts;
    const std::int64_t step = std::max<std::int64_t>(time_of(0).duration, 1);
    return time_of(0).pts - static_cast<std::int64_t>(delay - packet) * step;
  };

  std::size_t before = 0;
  for (std::size_t s = 0; s < segments.size(); ++s) {
    Segment segment(segments[s]);
    if (s == 0) {
      container.Begin({segment.parameters(), clock, ToRational(source.frame_rate),
                       ToRational(source.pixel_aspect)},
                      source, warnings);
    }
    for (std::size_t i = 0; PacketPtr packet = segment.Next(); ++i) {
      // Its first packet, too, which decoders start at.
      if (i == 0 && !(packet->flags & AV_PKT_FLAG_KEY)) segment.Fail("begins in mid-stream");
      if (i >= places[s].size()) segment.Fail("was changed while it was read");
      const FrameTime time = time_of(before + places[s][i]);
      packet->pts = time.pts;
      packet->dts = decoded_at(before + i);
      packet->duration = time.duration;
      container.CopyUntil(time.pts);
      container.Write(std::move(packet));
      if (goes_on) goes_on(before + i + 1);
    }
    before += places[s].size();
  }
  container.Finish();
  return warnings;
}

}  // namespace calmframe::media
