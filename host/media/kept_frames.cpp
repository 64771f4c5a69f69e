#include "host/media/kept_frames.h"

#include <iterator>
#include <utility>

namespace calmframe::media {
namespace {

// Of the frame's own records, and of the list's.
constexpr std::size_t kBytesBeside = 4096;

// The same pixels and tags. What else a stream puts beside a frame has no bound.
FramePtr BareReference(const AVFrame& frame) {
  FramePtr bare(av_frame_clone(&frame));
  if (!bare) return nullptr;
  while (bare->nb_side_data > 0) av_frame_remove_side_data(bare.get(), bare->side_data[0]->type);
  av_dict_free(&bare->metadata);
  av_buffer_unref(&bare->opaque_ref);
  return bare;
}

std::size_t BytesOf(const AVFrame& frame) {
  std::size_t bytes = kBytesBeside;
  for (const AVBufferRef* buffer : frame.buf) {
    if (buffer) bytes += buffer->size;
  }
  return bytes;
}

}  // namespace

void KeptFrames::SetBound(std::size_t bytes) {
  const std::lock_guard lock(mutex_);
  bound_ = bytes;
}

void KeptFrames::Keep(std::size_t number, const AVFrame& frame) {
  const std::lock_guard lock(mutex_);
  if (bound_ == 0 || frame.hw_frames_ctx) return;
  if (!frames_.empty() && number <= frames_.rbegin()->first) return;
  const std::size_t bytes = BytesOf(frame);
  while (!frames_.empty() && bytes_ + bytes > bound_) Drop(frames_.begin());
  if (bytes > bound_) return;
  FramePtr bare = BareReference(frame);
  if (!bare) return;
  frames_.emplace_hint(frames_.end(), number, Kept{std::move(bare), bytes});
  bytes_ += bytes;
}

FramePtr KeptFrames::Take(std::size_t number) {
  const std::lock_guard lock(mutex_);
  const auto found = frames_.find(number);
  if (found == frames_.end()) return nullptr;
  if (bound_ > 0) return FramePtr(NotNull(av_frame_clone(found->second.frame.get())));
  FramePtr frame = std::move(found->second.frame);
  Drop(found);
  return frame;
}

std::optional<std::size_t> KeptFrames::From(std::size_t number) const {
  const std::lock_guard lock(mutex_);
  const auto next = frames_.lower_bound(number);
  if (next == frames_.end()) return {};
  return next->first;
}

void KeptFrames::Drop(std::map<std::size_t, Kept>::iterator kept) {
  bytes_ -= kept->second.bytes;
  frames_.erase(kept);
}

}  // namespace calmframe::media
