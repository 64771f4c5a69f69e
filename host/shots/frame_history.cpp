#include "host/shots/frame_history.h"

#include <algorithm>
#include <cmath>

namespace calmframe::host {
FrameHistory::Tone FrameHistory::ToneOf(const FrameDigest& digest) {
  const FrameDigest::Area& area = digest.area;
  if (area.IsEmpty()) return {};
  double sum = 0, squares = 0;
  for (int y = area.top; y < area.bottom; ++y) {
    for (int x = area.left; x < area.right; ++x) {
      const double v = digest.cells[static_cast<std::size_t>(y * FrameDigest::kColumns + x)];
      sum += v;
      squares += v * v;
    }
  }
  const double mean = sum / area.size();
  return {std::sqrt(std::max(0.0, squares / area.size() - mean * mean)), mean};
}

std::int64_t FrameHistory::first() const {
  return std::max<std::int64_t>(0, end_ - static_cast<std::int64_t>(entries_.size()));
}

// What a frame takes for bars may be a dark thing that goes by, or a picture that fades: bars stay.
FrameDigest::Area FrameHistory::SteadyArea(const FrameDigest::Area& last) const {
  constexpr std::int64_t kFrames = 32;
  std::vector<FrameDigest::Area> areas;
  if (!last.IsEmpty()) areas.push_back(last);
  for (std::int64_t f = std::max(first(), end_ - kFrames); f < end_; ++f) {
    if (!At(f).area.IsEmpty()) areas.push_back(At(f).area);
  }
  if (areas.empty()) return {};
  const auto median = [&](int FrameDigest::Area::*edge) {
    const auto middle = areas.begin() + static_cast<std::ptrdiff_t>(areas.size() / 2);
    std::nth_element(areas.begin(), middle, areas.end(),
                     [edge](const auto& a, const auto& b) { return a.*edge < b.*edge; });
    return *middle.*edge;
  };
  using Sides = FrameDigest::Area;
  const Sides area{median(&Sides::left), median(&Sides::top), median(&Sides::right),
                   median(&Sides::bottom)};
  return area.IsEmpty() ? Sides{} : area;
}

void FrameHistory::Add(const FrameDigest& digest) {
  Entry& entry = entries_[static_cast<std::size_t>(end_) % entries_.size()];
  // Ahead of the entry, which is an old frame's.
  const FrameDigest::Area steady = SteadyArea(digest.area);
  entry = Entry{digest, digest.area, {}, {}, {}, {}, {}};
  entry.digest.area = steady;
  entry.detail = DetailOf(entry.digest);
  entry.parts = PartsOf(entry.digest, entry.detail);
  entry.tone = ToneOf(entry.digest);
  if (end_ > 0) {
    const Entry& before = At(end_ - 1);
    entry.match = MatchOf(before.digest, entry.digest);
    entry.place = before.place + entry.match.shift;
  }
  ++end_;
}

}  // namespace calmframe::host
