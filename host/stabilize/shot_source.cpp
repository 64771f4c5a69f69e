#include "host/stabilize/shot_source.h"

#include <algorithm>
#include <utility>

namespace calmframe::host {
namespace {

double FramesPerSecond(const SourceInfo& info) {
  return static_cast<double>(HX_TICKS_PER_SECOND) / static_cast<double>(info.ticks_per_frame);
}

}  // namespace

ShotSource::ShotSource(SourcePtr source, const media::FrameRange& range,
                       std::optional<std::vector<ShotBorder>> borders)
    : source_(std::move(source)),
      range_(range),
      looks_(!borders),
      finder_({.frames_per_second = FramesPerSecond(source_->info())}),
      next_(static_cast<std::int64_t>(range.first)),
      borders_(std::move(borders).value_or(std::vector<ShotBorder>())) {}

PicturePtr ShotSource::Fetch(std::int64_t frame, PixelKind kind) {
  if (looks_ && kind == PixelKind::argb8) CatchUp(frame);
  PicturePtr picture = source_->Fetch(frame, kind);
  if (!looks_ || !picture || kind != PixelKind::argb8) return picture;
  {
    std::lock_guard lock(mutex_);
    if (frame < next_ || waiting_.count(frame) > 0) return picture;
  }
  Look(frame, DigestOf(ViewOf(*picture)));
  return picture;
}

void ShotSource::CatchUp(std::int64_t frame) {
  constexpr std::int64_t kAhead = 16;  // more than an analysis asks ahead
  const std::int64_t last = std::min(frame, static_cast<std::int64_t>(range_.end));
  const std::lock_guard alone(catching_up_);
  while (true) {
    std::int64_t next;
    {
      const std::lock_guard lock(mutex_);
      next = next_;
    }
    if (last - next <= kAhead) return;
    const PicturePtr picture = source_->Fetch(next, PixelKind::argb8);
    if (!picture) return;
    Look(next, DigestOf(ViewOf(*picture)));
  }
}

void ShotSource::Look(std::int64_t frame, const FrameDigest& digest) {
  const auto end = static_cast<std::int64_t>(range_.end);
  std::lock_guard lock(mutex_);
  if (frame < next_ || frame >= end) return;
  waiting_.emplace(frame, digest);
  const std::int64_t seen = next_;
  for (auto first = waiting_.begin(); first != waiting_.end() && first->first == next_;
       first = waiting_.erase(first)) {
    finder_.Add(first->second);
    ++next_;
  }
  if (next_ == seen) return;
  if (next_ == end) finder_.Finish();
  for (ShotBorder border : finder_.Take()) {
    // The finder counts from the range's first frame.
    for (std::int64_t* const place : {&border.frame, &border.first, &border.last}) {
      *place += static_cast<std::int64_t>(range_.first);
    }
    // Of a dissolve shortly before a cut that was told first: that shot may have ended by now.
    if (!borders_.empty() && border.frame <= borders_.back().frame) continue;
    borders_.push_back(border);
  }
}

std::int64_t ShotSource::EndOfShot(std::int64_t frame) const {
  std::lock_guard lock(mutex_);
  const auto next = std::find_if(borders_.begin(), borders_.end(),
                                 [frame](const ShotBorder& b) { return b.frame > frame; });
  return std::min(next == borders_.end() ? kNoEnd : next->frame, source_->EndOfShot(frame));
}

std::vector<ShotBorder> ShotSource::borders() const {
  std::lock_guard lock(mutex_);
  return borders_;
}

}  // namespace calmframe::host
