#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "host/shots/digest_match.h"
#include "host/shots/frame_digest.h"
#include "host/shots/mixture.h"
#include "host/shots/ramp_fit.h"

namespace calmframe::host {

// The last frames of a film and how each follows the one before, by their numbers in the film.
class FrameHistory {
 public:
  explicit FrameHistory(std::size_t capacity) : entries_(capacity) {}

  void Add(const FrameDigest& digest);

  std::int64_t end() const { return end_; }  // frames that were added
  std::int64_t first() const;                // the oldest that is kept
  bool Holds(std::int64_t frame) const { return first() <= frame && frame < end_; }

  const FrameDigest& digest(std::int64_t frame) const { return At(frame).digest; }
  const FrameDetail& detail(std::int64_t frame) const { return At(frame).detail; }
  const FrameParts& parts(std::int64_t frame) const { return At(frame).parts; }
  // From the frame before; nothing of the film's first and of frames that are not kept.
  DigestMatch match(std::int64_t frame) const {
    return Holds(frame) ? At(frame).match : DigestMatch{};
  }
  double difference(std::int64_t frame) const { return match(frame).difference; }
  // The motion of the picture, from match to match.
  CellShift Motion(std::int64_t from, std::int64_t to) const {
    return At(to).place - At(from).place;
  }
  // Standard deviation and mean of the frame's luma, in 255ths.
  double contrast(std::int64_t frame) const { return Holds(frame) ? At(frame).tone.contrast : 0; }
  double mean(std::int64_t frame) const { return Holds(frame) ? At(frame).tone.mean : 0; }
  double Difference(std::int64_t a, std::int64_t b) const {
    return MatchOf(digest(a), digest(b)).difference;
  }

 private:
  struct Tone {
    double contrast = 0, mean = 0;
  };
  struct Entry {
    FrameDigest digest;      // with the area of the frames about it
    FrameDigest::Area area;  // its own
    FrameDetail detail;
    FrameParts parts;
    DigestMatch match;
    CellShift place;  // the sum of the shifts so far
    Tone tone;
  };
  static Tone ToneOf(const FrameDigest& digest);
  FrameDigest::Area SteadyArea(const FrameDigest::Area& last) const;
  const Entry& At(std::int64_t frame) const {
    return entries_[static_cast<std::size_t>(frame) % entries_.size()];
  }

  std::vector<Entry> entries_;
  std::int64_t end_ = 0;
};

}  // namespace calmframe::host
