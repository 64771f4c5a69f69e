#include "host/media/frame_index.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <string_view>

#include "host/media/colour_model.h"

namespace calmframe::media {
namespace {

constexpr int kStartsTried = 3;  // keyframes to try before decoding from the start

// How far from its keyframe's number a frame with the same time stamp may stand, see NumberOf.
constexpr std::size_t kReach = 512;

std::int64_t OwnTime(const AVFrame& frame) {
  return frame.pts != AV_NOPTS_VALUE ? frame.pts : frame.pkt_dts;
}

void ReadOrientation(const AVStream& stream, ClipInfo& info) {
  const auto* stored = reinterpret_cast<const std::int32_t*>(
      av_stream_get_side_data(&stream, AV_PKT_DATA_DISPLAYMATRIX, nullptr));
  if (!stored) return;
  std::int32_t matrix[9];
  std::copy_n(stored, 9, matrix);
  const double determinant = double{1} * matrix[0] * matrix[4] - double{1} * matrix[1] * matrix[3];
  const bool mirrored = determinant < 0;
  if (mirrored) {
    // Unsigned: the least value has no opposite.
    for (const int entry : {0, 3}) {
      matrix[entry] = static_cast<std::int32_t>(0u - static_cast<std::uint32_t>(matrix[entry]));
    }
  }
  const double counterclockwise = av_display_rotation_get(matrix);
  if (determinant == 0 || !std::isfinite(counterclockwise)) return;
  const int quarters = static_cast<int>(std::lround(-counterclockwise / 90));
  info.rotation = ((quarters % 4) + 4) % 4 * 90;
  info.mirrored = mirrored;
}

AVRational FrameRate(const AVStream& stream, const std::vector<FrameTime>& times) {
  const std::int64_t ticks = times.back().pts + times.back().duration - times.front().pts;
  __int128 frames = __int128{static_cast<std::int64_t>(times.size())} * stream.time_base.den;
  __int128 seconds = __int128{ticks} * stream.time_base.num;
  for (; seconds > INT64_MAX; seconds >>= 1) frames >>= 1;
  AVRational measured{25, 1};
  av_reduce(&measured.num, &measured.den, static_cast<std::int64_t>(frames),
            static_cast<std::int64_t>(seconds), 1 << 30);
  if (measured.num <= 0 || measured.den <= 0) return {25, 1};
  const auto near_measured = [&](AVRational rate, double tolerance) {
    return rate.num > 0 && rate.den > 0 &&
           std::abs(av_q2d(rate) / av_q2d(measured) - 1) < tolerance;
  };
  // The container's round figure, unless the frames themselves say otherwise.
  if (near_measured(stream.r_frame_rate, 0.0002)) return stream.r_frame_rate;
  if (near_measured(stream.avg_frame_rate, 0.005)) return stream.avg_frame_rate;
  return measured;
}

void RepairTimes(const AVStream& stream, bool fields, std::vector<FrameTime>& times) {
  AVRational rate{25, 1};
  for (const AVRational told : {stream.r_frame_rate, stream.avg_frame_rate}) {
    if (told.num > 0 && told.den > 0) rate = told;
  }
  // Bounded, that a stream's worth of them has a place after its latest time.
  const std::int64_t nominal = std::clamp<std::int64_t>(
      av_rescale_q(1, av_inv_q(rate), stream.time_base), 1, std::int64_t{1} << 36);
  // One that its neighbours contradict is none, lest all that follow it crowd behind it.
  for (std::size_t i = 1; i + 1 < times.size(); ++i) {
    const std::int64_t before = times[i - 1].pts, after = times[i + 1].pts;
    const bool known = before != AV_NOPTS_VALUE && after != AV_NOPTS_VALUE;
    if (known && before < after && times[i].pts > after) times[i].pts = AV_NOPTS_VALUE;
  }
  for (std::size_t i = 0; i < times.size(); ++i) {
    std::int64_t& pts = times[i].pts;
    if (i == 0) {
      if (pts == AV_NOPTS_VALUE) pts = 0;
    } else if (pts == AV_NOPTS_VALUE) {
      pts = times[i - 1].pts + nominal;
    } else {
      pts = std::max(pts, times[i - 1].pts + 1);
    }
  }
  // A packet's own duration belongs to decoding order, so it serves for the last frame alone; that
  // of a field-coded frame is one field's.
  for (std::size_t i = 0; i + 1 < times.size(); ++i) {
    times[i].duration = times[i + 1].pts - times[i].pts;
  }
  FrameTime& last = times.back();
  if (fields || last.duration <= 0) {
    last.duration = times.size() > 1 ? times[times.size() - 2].duration : nominal;
  }
}

// Frames that the container promises, 0 if it doesn't say.
std::int64_t PromisedFrames(const Decoder& decoder) {
  AVStream* stream = decoder.container().streams[decoder.stream().index];
  if (!std::strstr(decoder.container().iformat->name, "mov")) return stream->nb_frames;
  std::int64_t promised = 0;
  for (int i = 0; i < avformat_index_get_entries_count(stream); ++i) {
    const AVIndexEntry* entry = avformat_index_get_entry(stream, i);
    if (!(entry->flags & AVINDEX_DISCARD_FRAME)) ++promised;
  }
  return promised;
}

std::string DamageLine(const Decoder& decoder, std::size_t frames) {
  const std::int64_t promised = PromisedFrames(decoder);
  const auto count = static_cast<std::int64_t>(frames);
  // Packed streams promise a frame or two more than they hold.
  const bool fewer = count + 2 < promised ||
                     (count < promised && std::strstr(decoder.container().iformat->name, "mov"));
  if (fewer) {
    return "damaged or cut short, " + std::to_string(count) + " of " + std::to_string(promised) +
           " frames decode";
  }
  if (decoder.damage() > 0) {
    return "damaged in " + std::to_string(decoder.damage()) + " places, " + std::to_string(count) +
           " frames decode";
  }
  const AVFormatContext& container = decoder.container();
  if (container.duration > 0 && TimeOrNone(container.duration) != AV_NOPTS_VALUE &&
      container.duration_estimation_method == AVFMT_DURATION_FROM_STREAM &&
      TimeOrNone(container.start_time) != AV_NOPTS_VALUE &&
      decoder.last_time() + AV_TIME_BASE / 2 < container.start_time + container.duration) {
    return "cut short, " + std::to_string(count) + " frames decode";
  }
  return {};
}

}  // namespace

std::uint64_t Fingerprint(const AVFrame& frame) {
  constexpr std::uint64_t kPrime = 0x9E3779B97F4A7C15u;
  std::uint64_t lanes[4] = {1, 2, 3, 4};
  const auto format = static_cast<AVPixelFormat>(frame.format);
  const AVPixFmtDescriptor* layout = av_pix_fmt_desc_get(format);
  for (int plane = 0; plane < 4 && frame.data[plane]; ++plane) {
    const int bytes = av_image_get_linesize(format, frame.width, plane);
    if (bytes <= 0) break;
    const bool chroma = (plane == 1 || plane == 2) && layout;
    const int rows = chroma ? AV_CEIL_RSHIFT(frame.height, layout->log2_chroma_h) : frame.height;
    for (int y = 0; y < rows; ++y) {
      const std::uint8_t* row = frame.data[plane] + std::ptrdiff_t{y} * frame.linesize[plane];
      int x = 0;
      for (; x + 32 <= bytes; x += 32) {
        for (int lane = 0; lane < 4; ++lane) {
          std::uint64_t word;
          std::memcpy(&word, row + x + 8 * lane, 8);
          lanes[lane] = (lanes[lane] ^ word) * kPrime;
          lanes[lane] ^= lanes[lane] >> 32;
        }
      }
      for (; x < bytes; ++x) lanes[0] = (lanes[0] ^ row[x]) * kPrime;
    }
    if (layout && (layout->flags & AV_PIX_FMT_FLAG_PAL)) break;
  }
  std::uint64_t hash = 0;
  for (const std::uint64_t lane : lanes) hash = (hash ^ lane ^ (lane >> 29)) * kPrime;
  return hash;
}

IndexEntry EntryOf(const AVFrame& frame) {
  return {OwnTime(frame), Fingerprint(frame), frame.key_frame != 0};
}

AVRational PixelAspect(const Decoder& decoder, const AVFrame& first) {
  return av_guess_sample_aspect_ratio(const_cast<AVFormatContext*>(&decoder.container()),
                                      const_cast<AVStream*>(&decoder.stream()),
                                      const_cast<AVFrame*>(&first));
}

ClipInfo InfoOf(const std::string& path, const Decoder& decoder, std::vector<FrameTime> times,
                const AVFrame& first, AVRational aspect, const FieldCounts& fields) {
  const AVStream& stream = decoder.stream();
  const bool interlaced = 2 * (fields.top_first + fields.bottom_first) > times.size();
  ClipInfo info;
  info.times = std::move(times);
  RepairTimes(stream, interlaced, info.times);
  info.path = path;
  info.stream = stream.index;
  info.frame_count = info.times.size();
  info.time_base = ToRatio(stream.time_base);
  info.frame_rate = ToRatio(FrameRate(stream, info.times));
  info.codec = avcodec_get_name(stream.codecpar->codec_id);
  ReadOrientation(stream, info);
  info.width = first.width;
  info.height = first.height;
  if (aspect.num <= 0 || aspect.den <= 0) aspect = {1, 1};
  if (info.rotation % 180 != 0) {
    std::swap(info.width, info.height);
    aspect = av_inv_q(aspect);
  } else if (interlaced) {
    // Upside down, an even number of rows puts the lower field's rows on top.
    const bool swapped = info.rotation == 180 && info.height % 2 == 0;
    info.field_order = (fields.top_first >= fields.bottom_first) != swapped
                           ? FieldOrder::top_first
                           : FieldOrder::bottom_first;
  }
  info.pixel_aspect = ToRatio(aspect);
  const AVPixFmtDescriptor* layout = av_pix_fmt_desc_get(static_cast<AVPixelFormat>(first.format));
  if (layout) {
    info.pixel_format = layout->name;
    info.bit_depth =
        layout->flags & AV_PIX_FMT_FLAG_PAL ? 8 : std::clamp(layout->comp[0].depth, 8, 16);
    info.has_alpha = (layout->flags & AV_PIX_FMT_FLAG_ALPHA) != 0;
  }
  info.colour = TagsOf(first);
  return info;
}

void FrameScan::Add(const AVFrame& frame) {
  if (index_.size() == most_) {
    throw Failure(Failure::Side::input, path_ + ": more than " + std::to_string(most_) + " frames");
  }
  index_.push_back(EntryOf(frame));
  times_.push_back({TimeOrNone(frame.best_effort_timestamp),
                    std::max<std::int64_t>(TimeOrNone(frame.pkt_duration), 0)});
  if (frame.interlaced_frame) {
    ++(frame.top_field_first ? fields_.top_first : fields_.bottom_first);
  }
  if (first_) return;
  aspect_ = PixelAspect(decoder_, frame);
  first_.reset(NotNull(av_frame_clone(&frame)));
}

ClipInfo FrameScan::Finish() {
  if (!first_) {
    throw Failure(Failure::Side::input, path_ + ": no frame of its video stream decodes");
  }
  const std::string_view kind = decoder_.container().iformat->name;
  if (index_.size() == 1 && (kind == "image2" || kind.ends_with("_pipe"))) {
    throw Failure(Failure::Side::input,
                  path_ +
                      ": one picture alone has no motion; more of them are named by f%04d.png, "
                      "by a quoted glob, or by their folder");
  }
  ClipInfo info = InfoOf(path_, decoder_, std::move(times_), *first_, aspect_, fields_);
  const std::string damage = DamageLine(decoder_, index_.size());
  if (!damage.empty()) info.warning = path_ + ": " + damage;
  return info;
}

FrameIndex ScanFrames(const std::string& path, ClipInfo& info, std::size_t most) {
  const auto scan = [&](int threads) -> std::optional<FrameIndex> {
    Decoder decoder(path, threads);
    const auto is_damaged = [&] { return decoder.complained() || decoder.damage() > 0; };
    FrameScan found(path, decoder, most);
    while (const FramePtr frame = decoder.Next()) {
      if (threads != 1 && is_damaged()) return {};
      found.Add(*frame);
    }
    if (threads != 1 && is_damaged()) return {};
    info = found.Finish();
    return found.TakeIndex();
  };
  if (std::optional<FrameIndex> index = scan(0)) return *std::move(index);
  return *scan(1);
}

bool FrameFinder::BeginsAs(const ClipInfo& info) {
  const AVStream& stream = decoder_.stream();
  if (stream.index != info.stream || avcodec_get_name(stream.codecpar->codec_id) != info.codec ||
      stream.time_base.num != info.time_base.num || stream.time_base.den != info.time_base.den) {
    return false;
  }
  pending_ = decoder_.Next();
  if (!pending_) return false;
  const bool turned = info.rotation % 180 != 0;
  return pending_->width == (turned ? info.height : info.width) &&
         pending_->height == (turned ? info.width : info.height) &&
         OwnTime(*pending_) == index_[0].pts && Fingerprint(*pending_) == index_[0].fingerprint;
}

std::vector<std::size_t> FrameFinder::StartsFor(std::size_t frame) const {
  std::vector<std::size_t> starts;
  for (std::size_t i = frame + 1; i-- > 1 && starts.size() < kStartsTried;) {
    if (index_[i].keyframe && index_[i].pts != AV_NOPTS_VALUE) starts.push_back(i);
  }
  return starts;
}

std::optional<std::size_t> FrameFinder::NumberOf(const AVFrame& frame,
                                                 std::size_t near_frame) const {
  const std::int64_t pts = OwnTime(frame);
  if (pts == AV_NOPTS_VALUE) return {};
  const std::size_t begin = near_frame - std::min(near_frame, kReach);
  const std::size_t end = std::min(near_frame + kReach, index_.size());
  std::optional<std::size_t> found;
  const std::uint64_t fingerprint = Fingerprint(frame);
  for (std::size_t i = begin; i < end; ++i) {
    if (index_[i].pts != pts || index_[i].fingerprint != fingerprint) continue;
    if (found) return {};
    found = i;
  }
  return found;
}

bool FrameFinder::SeekTo(std::size_t start, std::size_t frame, const std::atomic<bool>& stop) {
  next_.reset();
  pending_.reset();
  if (!decoder_.Seek(index_[start].pts)) return false;
  verified_ = false;
  for (std::size_t skipped = 0; skipped < kReach && !stop; ++skipped) {
    FramePtr decoded = decoder_.Next();
    if (!decoded) return false;
    const std::optional<std::size_t> number = NumberOf(*decoded, start);
    if (!number) continue;
    if (*number > frame) return false;
    next_ = number;
    pending_ = std::move(decoded);
    return true;
  }
  return false;
}

FramePtr FrameFinder::Forward(std::size_t frame, const std::atomic<bool>& stop) {
  while (!stop) {
    FramePtr decoded = pending_ ? std::move(pending_) : decoder_.Next();
    if (!decoded || *next_ >= index_.size() ||
        (!verified_ && Fingerprint(*decoded) != index_[*next_].fingerprint)) {
      next_.reset();
      return nullptr;
    }
    if ((*next_)++ == frame) return decoded;
  }
  return nullptr;
}

FramePtr FrameFinder::Get(std::size_t frame, const std::atomic<bool>& stop) {
  const std::vector<std::size_t> starts = StartsFor(frame);
  if (next_ && *next_ <= frame && (starts.empty() || starts.front() <= *next_)) {
    if (FramePtr found = Forward(frame, stop)) return found;
  }
  for (const std::size_t start : starts) {
    if (stop) return nullptr;
    if (!SeekTo(start, frame, stop)) continue;
    if (FramePtr found = Forward(frame, stop)) return found;
  }
  if (stop) return nullptr;
  decoder_.Rewind();
  next_ = 0;
  pending_.reset();
  verified_ = true;
  if (FramePtr found = Forward(frame, stop)) return found;
  if (stop) return nullptr;
  throw Failure(Failure::Side::input,
                path_ + ": frame " + std::to_string(frame) + " no longer decodes");
}

}  // namespace calmframe::media
