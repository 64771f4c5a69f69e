#pragma once

#include <cstdint>
#include <optional>

#include "host/shots/frame_history.h"
#include "host/shots/ramp_fit.h"
#include "host/shots/shot_finder.h"

namespace calmframe::host {

// Looks for frames between two shots in which both are mixed. It is asked frame by frame, some time
// behind what the history has.
class DissolveSearch {
 public:
  explicit DissolveSearch(double frames_per_second);

  // How far before and behind a frame it looks.
  std::int64_t reach() const { return kReach * step_; }
  // How many frames it needs of the history.
  std::int64_t memory() const { return 4 * reach(); }

  // Takes the next frame, of which all `reach` behind it are known or will not come. It is in a
  // shot that begins with `first` and ends before `end`, as far as cuts tell. A dissolve that is
  // over by now, if there is one.
  std::optional<ShotBorder> Next(const FrameHistory& history, std::int64_t frame,
                                 std::int64_t first, std::int64_t end);
  // No more frames.
  std::optional<ShotBorder> Finish(const FrameHistory& history);

 private:
  static constexpr int kReach = 28;  // of steps

  // Where one may lie.
  struct Span {
    std::int64_t before = 0,
                 behind = 0;          // the last frame of one shot alone, the first of the other
    std::int64_t first = 0, end = 0;  // what cuts leave about it
    double evidence = 0;              // see DipFit
    double rank = 0;
  };
  std::optional<Span> SpanAbout(const FrameHistory& history, std::int64_t frame, std::int64_t first,
                                std::int64_t end) const;
  Ramp RampOf(const FrameHistory& history, const Span& span) const;
  bool MayBe(const FrameHistory& history, Span& span) const;
  Span Settled(const FrameHistory& history, Span span) const;
  std::optional<ShotBorder> BorderOf(const FrameHistory& history, const Span& span) const;

  const std::int64_t step_;   // frames, of about a 30th of a second
  std::optional<Span> best_;  // of those that overlap
};

}  // namespace calmframe::host
