#include "host/media/stream_copy.h"

#include <algorithm>
#include <cstring>
#include <memory>

#include "host/media/decoder.h"

namespace calmframe::media {
namespace {

// In AV_TIME_BASE ticks. Subtitles that began so long before a part are still found.
constexpr std::int64_t kLongestSubtitle = 30 * std::int64_t{AV_TIME_BASE};
// So far containers may lay the packets of one instant apart.
constexpr std::int64_t kInterleaving = 10 * std::int64_t{AV_TIME_BASE};

void CopyTags(const AVDictionary* from, AVDictionary*& to) {
  if (av_dict_copy(&to, from, 0) < 0) throw std::bad_alloc();
}

void CopySideData(const AVPacketSideData& data, AVStream& to) {
  std::memcpy(NotNull(av_stream_new_side_data(&to, data.type, data.size)), data.data, data.size);
}

bool AddStream(const AVStream& from, AVFormatContext& output) {
  AVStream* to = NotNull(avformat_new_stream(&output, nullptr));
  if (avcodec_parameters_copy(to->codecpar, from.codecpar) < 0) return false;
  to->codecpar->codec_tag = TagFor(*output.oformat, *from.codecpar);
  to->time_base = from.time_base;
  to->disposition = from.disposition;
  to->sample_aspect_ratio = from.sample_aspect_ratio;
  to->avg_frame_rate = from.avg_frame_rate;
  to->r_frame_rate = from.r_frame_rate;
  CopyTags(from.metadata, to->metadata);
  for (int i = 0; i < from.nb_side_data; ++i) CopySideData(from.side_data[i], *to);
  return true;
}

// A clip's clock in its first frame, brought to that of the part's first.
void AdvanceTimecode(const ClipInfo& source, AVDictionary*& tags) {
  const AVDictionaryEntry* told = av_dict_get(tags, "timecode", nullptr, 0);
  if (!told) return;
  AVTimecode clock;
  char text[AV_TIMECODE_STR_SIZE];
  const bool known = av_timecode_init_from_string(&clock, ToRational(source.frame_rate),
                                                  told->value, nullptr) >= 0;
  if (known) av_timecode_make_string(&clock, text, static_cast<int>(source.cut->frame));
  av_dict_set(&tags, "timecode", known ? text : nullptr, 0);
}

// Muxers say what they take only by writing a header, so one is written into memory.
bool Takes(const AVOutputFormat& format, const AVStream& video, const AVStream& stream) {
  AVFormatContext* trial = nullptr;
  if (avformat_alloc_output_context2(&trial, &format, nullptr, nullptr) < 0) return false;
  const std::unique_ptr<AVFormatContext, decltype(&avformat_free_context)> own(
      trial, avformat_free_context);
  bool taken =
      AddStream(video, *trial) && AddStream(stream, *trial) && avio_open_dyn_buf(&trial->pb) >= 0;
  if (taken) {
    taken = avformat_write_header(trial, nullptr) >= 0;
    std::uint8_t* bytes = nullptr;
    avio_close_dyn_buf(trial->pb, &bytes);
    av_free(bytes);
    trial->pb = nullptr;
  }
  return taken;
}

}  // namespace

std::uint32_t TagFor(const AVOutputFormat& format, const AVCodecParameters& parameters) {
  unsigned tag = 0;
  const bool keeps =
      !format.codec_tag ||
      av_codec_get_id(format.codec_tag, parameters.codec_tag) == parameters.codec_id ||
      !av_codec_get_tag2(format.codec_tag, parameters.codec_id, &tag);
  return keeps ? parameters.codec_tag : 0;
}

StreamCopy::StreamCopy(const ClipInfo& source, const std::string& shown, AVFormatContext& output,
                       std::vector<std::string>& warnings)
    : input_(OpenInput(source.path)), output_(output) {
  // A broadcast clock starts anywhere; in another kind of file the clip starts at 0.
  const bool broadcast = (input_->iformat->flags & AVFMT_TS_DISCONT) != 0;
  if (broadcast && !(std::strcmp(output.oformat->name, "mpegts") == 0) &&
      input_->start_time != AV_NOPTS_VALUE) {
    offset_ = {input_->start_time, AV_TIME_BASE_Q};
  }
  if (source.cut && !source.times.empty()) {
    cut_ = true;
    offset_ = {source.cut->pts, ToRational(source.time_base)};
    length_ = {source.times.back().pts + source.times.back().duration, offset_.base};
  }
  for (unsigned i = 0; i < input_->nb_streams; ++i) {
    AVStream& from = *input_->streams[i];
    if (static_cast<int>(i) == source.stream) {
      CopyVideoProperties(from, *output.streams[0]);
      from.discard = AVDISCARD_ALL;
      continue;
    }
    const AVCodecParameters& parameters = *from.codecpar;
    if (avformat_query_codec(output.oformat, parameters.codec_id, FF_COMPLIANCE_NORMAL) == 0 ||
        !Takes(*output.oformat, *output.streams[0], from) || !AddStream(from, output)) {
      const char* type = av_get_media_type_string(parameters.codec_type);
      warnings.push_back(shown + ": a " + output.oformat->name + " file can't hold stream " +
                         std::to_string(i) + " (" + (type ? type : "unknown") + ", " +
                         avcodec_get_name(parameters.codec_id) + "), left out");
      from.discard = AVDISCARD_ALL;
      continue;
    }
    to_[static_cast<int>(i)] = static_cast<int>(output.nb_streams) - 1;
  }
  CopyTags(input_->metadata, output.metadata);
  for (const char* key : {"major_brand", "minor_version", "compatible_brands", "encoder"}) {
    av_dict_set(&output.metadata, key, nullptr, 0);
  }
  CopyChapters();
  if (!cut_) return;
  for (AVDictionary** tags : {&output.metadata, &output.streams[0]->metadata}) {
    AdvanceTimecode(source, *tags);
  }
  // Where that can't be, what lies before the part is read and dropped.
  const std::int64_t from = offset_.In(AV_TIME_BASE_Q) - kLongestSubtitle;
  if (input_->start_time == AV_NOPTS_VALUE || from > input_->start_time) {
    av_seek_frame(input_.get(), -1, from, AVSEEK_FLAG_BACKWARD);
  }
}

void StreamCopy::CopyVideoProperties(const AVStream& from, AVStream& to) {
  CopyTags(from.metadata, to.metadata);
  for (const char* key :
       {"rotate", "encoder", "alpha_mode", "DURATION", "BPS", "NUMBER_OF_BYTES"}) {
    av_dict_set(&to.metadata, key, nullptr, 0);
  }
  to.disposition = from.disposition;
  for (int i = 0; i < from.nb_side_data; ++i) {
    const AVPacketSideData& data = from.side_data[i];
    switch (data.type) {
      case AV_PKT_DATA_MASTERING_DISPLAY_METADATA:
      case AV_PKT_DATA_CONTENT_LIGHT_LEVEL:
      case AV_PKT_DATA_STEREO3D:
      case AV_PKT_DATA_SPHERICAL:
        CopySideData(data, to);
        break;
      default:
        break;  // about the old encoding, or applied to the pixels
    }
  }
}

void StreamCopy::CopyChapters() {
  if (input_->nb_chapters == 0) return;
  output_.chapters =
      static_cast<AVChapter**>(NotNull(av_calloc(input_->nb_chapters, sizeof(AVChapter*))));
  for (unsigned i = 0; i < input_->nb_chapters; ++i) {
    const AVChapter& from = *input_->chapters[i];
    if (TimeOrNone(from.start) == AV_NOPTS_VALUE || TimeOrNone(from.end) == AV_NOPTS_VALUE)
      continue;
    const std::int64_t shift = offset_.In(from.time_base);
    std::int64_t end = from.end - shift;
    if (cut_) end = std::min(end, length_.In(from.time_base));
    if (cut_ && end <= std::max<std::int64_t>(from.start - shift, 0)) continue;
    auto* to = static_cast<AVChapter*>(NotNull(av_mallocz(sizeof(AVChapter))));
    to->id = from.id;
    to->time_base = from.time_base;
    to->start = std::max<std::int64_t>(from.start - shift, 0);
    to->end = std::max(end, to->start);
    output_.chapters[output_.nb_chapters++] = to;
    CopyTags(from.metadata, to->metadata);
  }
}

bool StreamCopy::Cut(const AVStream& from, AVPacket& packet) {
  if (from.disposition & AV_DISPOSITION_ATTACHED_PIC) {  // stands for the whole clip
    packet.pts = packet.dts = 0;
    return true;
  }
  const std::int64_t length = length_.In(from.time_base);
  const std::int64_t begin = packet.pts != AV_NOPTS_VALUE ? packet.pts : packet.dts;
  if (begin == AV_NOPTS_VALUE) return false;
  const std::int64_t end = begin + std::max<std::int64_t>(TimeOrNone(packet.duration), 1);
  if (begin >= length || end <= 0) return false;
  if (from.codecpar->codec_type == AVMEDIA_TYPE_SUBTITLE && packet.duration > 0) {
    packet.pts = packet.dts = std::max<std::int64_t>(begin, 0);
    packet.duration = std::min(end, length) - packet.pts;
  }
  if (begun_.count(packet.stream_index) == 0 && !(packet.flags & AV_PKT_FLAG_KEY)) return false;
  begun_.insert(packet.stream_index);
  return true;
}

PacketPtr StreamCopy::Next() {
  if (to_.empty()) return nullptr;
  PacketPtr packet = NewPacket();
  while ((error_ = av_read_frame(input_.get(), packet.get())) >= 0) {
    const auto found = to_.find(packet->stream_index);
    if (found == to_.end()) {
      av_packet_unref(packet.get());
      continue;
    }
    const AVStream& stream = *input_->streams[packet->stream_index];
    const AVRational from = stream.time_base;
    const AVRational to = output_.streams[found->second]->time_base;
    const std::int64_t shift = offset_.In(from);
    packet->pts = TimeOrNone(packet->pts);
    packet->dts = TimeOrNone(packet->dts);
    if (packet->pts != AV_NOPTS_VALUE) packet->pts -= shift;
    if (packet->dts == AV_NOPTS_VALUE) {
      packet->dts = packet->pts;
    } else {
      packet->dts -= shift;
    }
    if (cut_ && !Cut(stream, *packet)) {
      const bool beyond =
          packet->dts != AV_NOPTS_VALUE && av_rescale_q(packet->dts, from, AV_TIME_BASE_Q) >
                                               length_.In(AV_TIME_BASE_Q) + kInterleaving;
      if (beyond) {
        error_ = 0;
        return nullptr;
      }
      av_packet_unref(packet.get());
      continue;
    }
    av_packet_rescale_ts(packet.get(), from, to);
    packet->stream_index = found->second;
    packet->pos = -1;
    const auto last = last_dts_.find(packet->stream_index);
    if (packet->dts != AV_NOPTS_VALUE) {
      const bool strict = !(output_.oformat->flags & AVFMT_TS_NONSTRICT);
      if (last != last_dts_.end() && packet->dts < last->second + strict) {
        packet->dts = last->second + strict;
        if (packet->pts != AV_NOPTS_VALUE) packet->pts = std::max(packet->pts, packet->dts);
      }
      last_dts_[packet->stream_index] = packet->dts;
      time_ = std::max(time_, av_rescale_q(packet->dts, to, AV_TIME_BASE_Q));
    }
    return packet;
  }
  if (error_ == AVERROR_EOF) error_ = 0;
  return nullptr;
}

}  // namespace calmframe::media
