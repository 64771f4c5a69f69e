#include "host/media/decode_ahead.h"

#include <utility>

namespace calmframe::media {
namespace {

// Enough to even out a keyframe's cost; a frame of 1920 x 1080 takes 3 to 12 MiB.
constexpr std::size_t kFramesAhead = 4;

}  // namespace

DecodeAhead::DecodeAhead(Get get, std::size_t first, std::size_t end)
    : get_(std::move(get)), end_(end), next_(first), thread_([this, first] { Run(first); }) {}

DecodeAhead::~DecodeAhead() {
  {
    std::lock_guard lock(mutex_);
    stop_ = true;
  }
  changed_.notify_all();
  thread_.join();
}

void DecodeAhead::Run(std::size_t first) {
  try {
    for (std::size_t frame = first; frame < end_; ++frame) {
      FramePtr decoded = get_(frame, stop_);
      if (!decoded) return;
      std::unique_lock lock(mutex_);
      changed_.wait(lock, [this] { return stop_ || frames_.size() < kFramesAhead; });
      if (stop_) return;
      frames_.push_back(std::move(decoded));
      changed_.notify_all();
    }
  } catch (...) {
    std::lock_guard lock(mutex_);
    failure_ = std::current_exception();
    changed_.notify_all();
  }
}

FramePtr DecodeAhead::Pop() {
  std::unique_lock lock(mutex_);
  changed_.wait(lock, [this] { return failure_ || !frames_.empty(); });
  if (frames_.empty()) std::rethrow_exception(failure_);
  FramePtr frame = std::move(frames_.front());
  frames_.pop_front();
  ++next_;
  changed_.notify_all();
  return frame;
}

}  // namespace calmframe::media
