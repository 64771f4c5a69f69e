#include "editors/mlt/analysis.h"

#include <chrono>

namespace calmframe::mlt {
namespace {

// A frame thread that is so far behind has been left out.
constexpr std::chrono::seconds kTurn(20);

}  // namespace

Options OptionsFor(const ClipFrames& frames, const PictureKind& kind) {
  Options options;
  options.width = frames.width;
  options.height = frames.height;
  options.aspect_num = frames.aspect_num;
  options.aspect_den = frames.aspect_den;
  options.rate_num = frames.rate_num;
  options.rate_den = frames.rate_den;
  options.identity = frames.identity.c_str();
  options.shots = CALMFRAME_SHOTS_ONE;
  SetKind(kind, &options);
  return options;
}

Analysis::Analysis(const ClipFrames& frames, const PictureKind& kind, const Controls& controls,
                   std::int64_t first, std::int64_t count)
    : first_(first), count_(count), session_([&] {
        Options options = OptionsFor(frames, kind);
        options.frame_count = count;
        return options;
      }()) {
  for (const auto& [name, value] : controls) session_.Set(name, value);
}

bool Analysis::Push(std::int64_t source_frame, const calmframe_image& image) {
  const std::int64_t number = source_frame - first_;
  std::unique_lock lock(mutex_);
  const auto is_due = [&] { return next_ >= number && !is_pushing_; };
  if (!changed_.wait_for(lock, kTurn, is_due)) {
    throw Error(CALMFRAME_ERROR_SOURCE, "source frame " + std::to_string(first_ + next_) +
                                            " was left out; analyse with real_time=-1");
  }
  if (next_ != number || number >= count_) return false;
  is_pushing_ = true;
  lock.unlock();
  struct End {
    ~End() {
      const std::lock_guard end(analysis.mutex_);
      analysis.is_pushing_ = false;
      ++analysis.next_;
      analysis.changed_.notify_all();
    }
    Analysis& analysis;
  };
  const End end{*this};
  session_.Push(number, image);
  if (number + 1 < count_) return false;
  session_.Wait();
  return true;
}

}  // namespace calmframe::mlt
