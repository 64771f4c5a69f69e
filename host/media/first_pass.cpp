#include "host/media/first_pass.h"

#include <algorithm>
#include <optional>
#include <utility>
#include <vector>

namespace calmframe::media {
namespace {

// The times of a stream's packets, where each has one of its own and none of them is dropped by an
// edit of its maker's; else none. Frames that come in the order of their packets may be known by
// the time of decoding alone, as in AVI.
std::vector<FrameTime> PromisedTimes(const std::string& path, int stream) {
  const InputPtr container = OpenInput(path);
  const AVCodecDescriptor* const codec =
      avcodec_descriptor_get(container->streams[stream]->codecpar->codec_id);
  const bool in_order = codec && (codec->props & AV_CODEC_PROP_REORDER) == 0;
  for (unsigned i = 0; i < container->nb_streams; ++i) {
    if (static_cast<int>(i) != stream) container->streams[i]->discard = AVDISCARD_ALL;
  }
  const PacketPtr packet = NewPacket();
  std::vector<FrameTime> times;
  int error;
  while ((error = av_read_frame(container.get(), packet.get())) >= 0) {
    const bool counts = packet->stream_index == stream;
    const bool by_decoding = in_order && packet->pts == AV_NOPTS_VALUE;
    const FrameTime time{TimeOrNone(by_decoding ? packet->dts : packet->pts),
                         std::max<std::int64_t>(TimeOrNone(packet->duration), 0)};
    const bool odd = (packet->flags & (AV_PKT_FLAG_DISCARD | AV_PKT_FLAG_CORRUPT)) != 0;
    av_packet_unref(packet.get());
    if (!counts) continue;
    if (odd || time.pts == AV_NOPTS_VALUE || times.size() == kMaximumFrames) return {};
    times.push_back(time);
  }
  if (error == AVERROR(ENOMEM)) throw std::bad_alloc();
  if (error != AVERROR_EOF) return {};
  const auto before = [](const FrameTime& a, const FrameTime& b) { return a.pts < b.pts; };
  std::sort(times.begin(), times.end(), before);
  const auto is_repeated = [](const FrameTime& a, const FrameTime& b) { return a.pts == b.pts; };
  if (std::adjacent_find(times.begin(), times.end(), is_repeated) != times.end()) return {};
  return times;
}

}  // namespace

std::vector<std::uint8_t> PromisedFrames::Bytes() const {
  const std::shared_ptr<const FrameList> found = list();
  return found ? found->Bytes() : std::vector<std::uint8_t>();
}

std::shared_ptr<const FrameList> PromisedFrames::list() const {
  return standing_ == Standing::decoded ? list_ : nullptr;
}

void PromisedFrames::Keep(FrameList list) {
  list_ = std::make_shared<const FrameList>(std::move(list));
  standing_ = Standing::decoded;
}

std::unique_ptr<FirstPass> FirstPass::Begin(const std::string& path, const ClipReader::Part& part) {
  auto decoder = std::make_unique<Decoder>(path);
  FramePtr first = decoder->Next();
  // Fields may come as frames of their own, or not.
  if (!first || first->interlaced_frame || decoder->damage() > 0 || decoder->complained()) {
    return nullptr;
  }
  std::vector<FrameTime> times = PromisedTimes(path, decoder->stream().index);
  if (times.empty() || times[0].pts != TimeOrNone(first->best_effort_timestamp)) return nullptr;
  const ClipInfo promised =
      InfoOf(path, *decoder, std::move(times), *first, PixelAspect(*decoder, *first), {});
  const FrameRange range = part ? part(promised) : FrameRange{0, promised.frame_count};
  std::unique_ptr<FirstPass> pass(
      new FirstPass(path, std::move(decoder), std::move(first), promised, range));
  return range.first == 0 || pass->Seek() ? std::move(pass) : nullptr;
}

FirstPass::FirstPass(const std::string& path, std::unique_ptr<Decoder> decoder, FramePtr first,
                     const ClipInfo& promised, const FrameRange& range)
    : path_(path),
      promised_(promised),
      range_(range),
      frames_(std::make_shared<PromisedFrames>()),
      decoder_(std::move(decoder)),
      scan_(path, *decoder_),
      frame_0_(EntryOf(*first)),
      first_(std::move(first)) {}

bool FirstPass::Seek() {
  first_.reset();
  if (!decoder_->Seek(promised_.times[range_.first].pts)) return false;
  // In front of the keyframe may come frames that refer to what was not read.
  do {
    first_ = decoder_->Next();
  } while (first_ && !first_->key_frame);
  if (!first_) return false;
  const std::int64_t pts = TimeOrNone(first_->best_effort_timestamp);
  const auto before = [](const FrameTime& time, std::int64_t at) { return time.pts < at; };
  const auto begin = promised_.times.begin();
  const auto found = std::lower_bound(begin, promised_.times.end(), pts, before);
  lead_ = next_ = static_cast<std::size_t>(found - begin);
  return lead_ <= range_.first && found->pts == pts;
}

void FirstPass::Break() {
  frames_->Break();
  throw Failure(Failure::Side::input, path_ + ": holds other frames than it promises");
}

FramePtr FirstPass::Next() {
  FramePtr got;
  try {
    got = first_ ? std::move(first_) : decoder_->Next();
  } catch (const Failure&) {
    Break();
  }
  if (!got || decoder_->damage() > 0 || decoder_->complained() ||
      TimeOrNone(got->best_effort_timestamp) != promised_.times[next_].pts ||
      (!IsWhole() && got->interlaced_frame)) {
    Break();
  }
  scan_.Add(*got);
  if (++next_ == range_.end) End();
  return got;
}

FramePtr FirstPass::Get(std::size_t frame, const std::atomic<bool>& stop) {
  begun_ = true;
  while (!stop) {
    if (frames_->standing() != Standing::promised || frame != std::max(next_, range_.first)) {
      Break();
    }
    const bool wanted = next_ == frame;
    FramePtr got = Next();
    if (wanted) return got;
  }
  return nullptr;
}

void FirstPass::End() {
  FrameList list;
  if (IsWhole()) {
    if (decoder_->Next() || decoder_->damage() > 0 || decoder_->complained()) Break();
    list.info = scan_.Finish();
    if (list.info != promised_) Break();
    list.index = scan_.TakeIndex();
    list.known = range_;
  } else {
    list = ListOfPart();
  }
  frames_->Keep(std::move(list));
}

FrameList FirstPass::ListOfPart() {
  FrameList list;
  list.info = promised_;
  list.known = {lead_, range_.end};
  for (const FrameTime& time : promised_.times) list.index.push_back({time.pts, 0, false});
  list.index[0] = frame_0_;
  const FrameIndex known = scan_.TakeIndex();
  std::copy(known.begin(), known.end(), list.index.begin() + static_cast<std::ptrdiff_t>(lead_));
  return list;
}

std::shared_ptr<const FrameList> FirstPass::Complete() {
  const std::atomic<bool> never = false;
  while (frames_->standing() != Standing::decoded) Get(std::max(next_, range_.first), never);
  return frames_->list();
}

}  // namespace calmframe::media
