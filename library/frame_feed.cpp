#include "library/frame_feed.h"

#include <algorithm>
#include <stdexcept>
#include <utility>

#include "library/refusal.h"

namespace calmframe::library {
namespace {

// The host's threads ask for neighbours in a slightly wrong order, and one ahead: so many frames
// are kept, and as many may be pushed ahead of the one that was asked for last.
constexpr std::size_t kKept = 6;
constexpr std::int64_t kAhead = 4;

thread_local bool is_fetching = false;

struct Fetching {
  Fetching() { is_fetching = true; }
  ~Fetching() { is_fetching = false; }
};

std::string NameOf(std::int64_t frame) {
  return "frame " + std::to_string(frame);
}

}  // namespace

FrameFeed::FrameFeed(const FrameFormat& format, const media::ClipInfo& clip,
                     const tessel::utility::Guid& content, calmframe_fetch fetch, void* user)
    : format_(format),
      info_(host::SourceInfoOf(clip)),
      fetch_(fetch),
      user_(user),
      pool_(host::PicturePool::Make()),
      conversion_(format, clip),
      buffer_(fetch ? format.NewBuffer() : FrameFormat::Buffer()),
      end_(fetch ? info_.frame_count : kNoEnd) {
  info_.content = content;
}

bool FrameFeed::IsFetching() {
  return is_fetching;
}

std::int64_t FrameFeed::EndOfShot(std::int64_t frame) const {
  const std::lock_guard lock(mutex_);
  return end_ < info_.frame_count && frame < end_ ? end_ : kNoEnd;
}

host::PicturePtr FrameFeed::Fetch(std::int64_t frame, host::PixelKind kind) {
  if (frame < 0 || frame >= info_.frame_count) return nullptr;
  if (host::PicturePtr picture = FetchHandedIn(frame, kind)) return picture;
  return is_pushed() ? FetchPushed(frame, kind) : FetchAsked(frame, kind);
}

host::PicturePtr FrameFeed::Miss(std::int64_t frame, const std::string& line) {
  const std::string text = NameOf(frame) + " " + line;
  const std::lock_guard lock(mutex_);
  if (stopped_) return nullptr;
  if (works_) throw std::runtime_error(text);
  missing_[frame] = text;
  return nullptr;
}

host::PicturePtr FrameFeed::Convert(const calmframe_image& image, host::PixelKind kind) {
  const boost::shared_ptr<host::Picture> picture =
      pool_->NewPicture(kind, info_.width, info_.height);
  conversion_.ToPicture(image, *picture);
  return picture;
}

host::PicturePtr FrameFeed::FindKept(std::int64_t frame, host::PixelKind kind) const {
  for (const Kept& kept : kept_) {
    if (kept.frame == frame && kept.picture->kind() == kind) return kept.picture;
  }
  return nullptr;
}

void FrameFeed::Keep(std::int64_t frame, const host::PicturePtr& picture) {
  kept_.push_back({frame, picture});
  while (kept_.size() > kKept && (!is_pushed() || kept_.front().frame + kAhead < wanted_)) {
    kept_.pop_front();
  }
}

// -- Pushed --

FrameFeed::Pushed FrameFeed::Push(std::int64_t frame, const calmframe_image& image, bool waits) {
  const auto is_far = [&] { return pushed_ >= wanted_ + kAhead; };
  {
    std::unique_lock lock(mutex_);
    if (end_ != kNoEnd) throw Refusal(CALMFRAME_ERROR_STATE, "all frames were pushed");
    if (frame != pushed_) {
      throw Refusal(CALMFRAME_ERROR_ARGUMENT,
                    NameOf(frame) + " was pushed, and the next is " + std::to_string(pushed_));
    }
    if (frame >= info_.frame_count) {
      throw Refusal(CALMFRAME_ERROR_ARGUMENT, NameOf(frame) + ": the session was opened for " +
                                                  std::to_string(info_.frame_count));
    }
    if (waits) changed_.wait(lock, [&] { return stopped_ || !works_ || !is_far(); });
    if (stopped_ || !works_) return Pushed::stopped;
    if (is_far()) return Pushed::no_room;
  }
  const host::PicturePtr picture = Convert(image, host::PixelKind::argb8);
  const std::lock_guard lock(mutex_);
  Keep(frame, picture);
  ++pushed_;
  if (pushed_ == info_.frame_count) end_ = pushed_;
  changed_.notify_all();
  return Pushed::taken;
}

void FrameFeed::Finish() {
  const std::lock_guard lock(mutex_);
  if (pushed_ == 0) throw Refusal(CALMFRAME_ERROR_STATE, "no frame was pushed");
  if (end_ == kNoEnd) end_ = pushed_;
  changed_.notify_all();
}

void FrameFeed::FinishAt(std::int64_t count) {
  const std::lock_guard lock(mutex_);
  end_ = count;
  changed_.notify_all();
}

bool FrameFeed::Comes(std::int64_t frame) {
  std::unique_lock lock(mutex_);
  changed_.wait(lock, [&] { return stopped_ || end_ != kNoEnd || pushed_ > frame; });
  return !stopped_ && (end_ == kNoEnd || frame < end_);
}

std::int64_t FrameFeed::count() const {
  const std::lock_guard lock(mutex_);
  return std::min(end_, info_.frame_count);
}

std::int64_t FrameFeed::pushed() const {
  const std::lock_guard lock(mutex_);
  return pushed_;
}

bool FrameFeed::is_whole() const {
  const std::lock_guard lock(mutex_);
  return end_ != kNoEnd;
}

host::PicturePtr FrameFeed::FetchPushed(std::int64_t frame, host::PixelKind kind) {
  {
    std::unique_lock lock(mutex_);
    if (works_ && kind == host::PixelKind::argb8) {
      if (wanted_ <= frame) {
        wanted_ = frame + 1;
        changed_.notify_all();
      }
      changed_.wait(lock, [&] { return stopped_ || pushed_ > frame || end_ != kNoEnd; });
      if (stopped_) return nullptr;
      // Asked for ahead, before it was told that there is none: what comes of it is left out.
      if (frame >= pushed_ && frame >= end_ && !kept_.empty()) return kept_.back().picture;
      if (host::PicturePtr picture = FindKept(frame, kind)) return picture;
    }
  }
  return Miss(frame,
              "was pushed and is gone; a render takes it in, or the session is opened with "
              "a function that fetches frames");
}

// -- Fetched --

host::PicturePtr FrameFeed::FetchAsked(std::int64_t frame, host::PixelKind kind) {
  const std::lock_guard asking(asking_);
  {
    const std::lock_guard lock(mutex_);
    if (stopped_) return nullptr;
    if (host::PicturePtr picture = FindKept(frame, kind)) return picture;
  }
  // What lies between is wanted next, so that the caller sees frames in order.
  const bool is_near = frame > asked_last_ && frame - asked_last_ <= kAhead;
  host::PicturePtr picture;
  for (std::int64_t f = is_near ? asked_last_ + 1 : frame; f <= frame; ++f) {
    picture = Ask(f, kind);
    if (!picture) return nullptr;
    asked_last_ = f;
    const std::lock_guard lock(mutex_);
    Keep(f, picture);
    missing_.erase(f);
  }
  return picture;
}

host::PicturePtr FrameFeed::Ask(std::int64_t frame, host::PixelKind kind) {
  const bool is_direct = format_.is_hosts(kind);
  const boost::shared_ptr<host::Picture> picture =
      pool_->NewPicture(kind, info_.width, info_.height);
  calmframe_image image = buffer_.image;
  if (is_direct) {
    image.plane[0] = picture->memory();
    image.stride[0] = picture->row_bytes();
  }
  const std::int32_t answer = [&] {
    const Fetching fetching;
    return fetch_(user_, frame, &image);
  }();
  if (answer != 0) return Miss(frame, "could not be fetched: code " + std::to_string(answer));
  if (!is_direct) conversion_.ToPicture(buffer_.image, *picture);
  return picture;
}

// -- Work --

void FrameFeed::BeginWork() {
  const std::lock_guard lock(mutex_);
  works_ = true;
  stopped_ = false;
  missing_.clear();
}

void FrameFeed::EndWork() {
  const std::lock_guard lock(mutex_);
  works_ = false;
  kept_.clear();
  changed_.notify_all();
}

void FrameFeed::Stop() {
  const std::lock_guard lock(mutex_);
  stopped_ = true;
  changed_.notify_all();
}

// -- Handed in --

FrameFeed::HandedIn::HandedIn(FrameFeed& feed, std::int64_t frame, const calmframe_image* image)
    : feed_(feed), image_(image) {
  if (!image_) return;
  const std::lock_guard lock(feed_.mutex_);
  place_ = feed_.lent_.emplace(frame, Lent{image_, 0});
}

FrameFeed::HandedIn::~HandedIn() {
  if (!image_) return;
  std::unique_lock lock(feed_.mutex_);
  feed_.changed_.wait(lock, [&] { return place_->second.readers == 0; });
  feed_.lent_.erase(place_);
}

host::PicturePtr FrameFeed::FetchHandedIn(std::int64_t frame, host::PixelKind kind) {
  std::unique_lock lock(mutex_);
  const auto found = lent_.find(frame);
  if (found == lent_.end()) return nullptr;
  Lent& lent = found->second;
  ++lent.readers;
  lock.unlock();
  const auto end = [&] {
    lock.lock();
    --lent.readers;
    missing_.erase(frame);
    changed_.notify_all();
  };
  try {
    const host::PicturePtr picture = Convert(*lent.image, kind);
    end();
    return picture;
  } catch (...) {
    end();
    throw;
  }
}

std::string FrameFeed::Missing(std::int64_t frame) {
  const std::lock_guard lock(mutex_);
  const auto found = frame < 0 ? missing_.begin() : missing_.find(frame);
  if (found == missing_.end()) return "";
  const std::string line = found->second;
  missing_.erase(found);
  return line;
}

}  // namespace calmframe::library
