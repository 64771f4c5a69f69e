#include "host/shots/frame_history.h"

#include <algorithm>
#include <cmath>

namespace calmframe::host {
namespace {

double ContrastOf(const FrameDigest& digest, const FrameDigest::Area& area) {
  if (area.IsEmpty()) return 0;
  double sum = 0, squares = 0;
  for (int y = area.top; y < area.bottom; ++y) {
    for (int x = area.left; x < area.right; ++x) {
      const double v = digest.cells[static_cast<std::size_t>(y * FrameDigest::kColumns + x)];
      sum += v;
      squares += v * v;
    }
  }
  const double mean = sum / area.size();
  return std::sqrt(std::max(0.0, squares / area.size() - mean * mean));
}

}  // namespace

std::int64_t FrameHistory::first() const {
  return std::max<std::int64_t>(0, end_ - static_cast<std::int64_t>(entries_.size()));
}

void FrameHistory::Add(const FrameDigest& digest) {
  Entry entry{digest, 0, {}, 0};
  // A frame that fades has no content by which its bars can be told: those of the last frames hold.
  constexpr std::int64_t kFrames = 32;
  FrameDigest::Area area = digest.area;
  for (std::int64_t f = std::max(first(), end_ - kFrames); f < end_; ++f) {
    const FrameDigest::Area& other = At(f).digest.area;
    if (other.IsEmpty()) continue;
    if (area.IsEmpty()) area = other;
    area = {std::min(area.left, other.left), std::min(area.top, other.top),
            std::max(area.right, other.right), std::max(area.bottom, other.bottom)};
  }
  entry.contrast = ContrastOf(digest, area);
  if (end_ > 0) {
    const Entry& before = At(end_ - 1);
    const DigestMatch match = MatchOf(before.digest, digest);
    entry.difference = match.difference;
    entry.place = before.place + match.shift;
  }
  entries_[static_cast<std::size_t>(end_) % entries_.size()] = entry;
  ++end_;
}

}  // namespace calmframe::host
