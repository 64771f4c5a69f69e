#include "host/media/first_pass.h"

#include <algorithm>
#include <cstring>
#include <optional>
#include <utility>
#include <vector>

namespace calmframe::media {
namespace {

// A container that has a table of its packets with a time for each, and drops none of them by an
// edit of its maker's; null or empty where there is no such promise.
std::vector<FrameTime> PromisedTimes(const std::string& path, int stream) {
  const InputPtr container = OpenInput(path);
  if (!std::strstr(container->iformat->name, "mov")) return {};
  const PacketPtr packet = NewPacket();
  std::vector<FrameTime> times;
  int error;
  while ((error = av_read_frame(container.get(), packet.get())) >= 0) {
    const bool counts = packet->stream_index == stream;
    const FrameTime time{TimeOrNone(packet->pts),
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

std::unique_ptr<FirstPass> FirstPass::Begin(const std::string& path) {
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
  return std::unique_ptr<FirstPass>(
      new FirstPass(path, std::move(decoder), std::move(first), promised));
}

FirstPass::FirstPass(const std::string& path, std::unique_ptr<Decoder> decoder, FramePtr first,
                     const ClipInfo& promised)
    : path_(path),
      promised_(promised),
      frames_(std::make_shared<PromisedFrames>()),
      decoder_(std::move(decoder)),
      scan_(path, *decoder_),
      first_(std::move(first)) {}

void FirstPass::Break() {
  frames_->Break();
  throw Failure(Failure::Side::input, path_ + ": holds other frames than it promises");
}

FramePtr FirstPass::Get(std::size_t frame, const std::atomic<bool>& stop) {
  if (stop) return nullptr;
  if (frames_->standing() != Standing::promised || frame != next_) Break();
  FramePtr got;
  try {
    got = first_ ? std::move(first_) : decoder_->Next();
  } catch (const Failure&) {
    Break();
  }
  if (!got || decoder_->damage() > 0 || decoder_->complained() ||
      TimeOrNone(got->best_effort_timestamp) != promised_.times[frame].pts) {
    Break();
  }
  scan_.Add(*got);
  if (++next_ == promised_.frame_count) End();
  return got;
}

void FirstPass::End() {
  if (decoder_->Next() || decoder_->damage() > 0 || decoder_->complained()) Break();
  FrameList list;
  list.info = scan_.Finish();
  if (list.info != promised_) Break();
  list.index = scan_.TakeIndex();
  frames_->Keep(std::move(list));
}

std::shared_ptr<const FrameList> FirstPass::Complete() {
  const std::atomic<bool> never = false;
  while (frames_->standing() != Standing::decoded) Get(next_, never);
  return frames_->list();
}

}  // namespace calmframe::media
