#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "host/shots/frame_history.h"
#include "host/shots/shot_finder.h"

namespace calmframe::host {

// Looks for frames that are a mixture of one before and one behind, neither of which fits the
// other by motion. It is asked frame by frame, some time behind what the history has.
class DissolveSearch {
 public:
  explicit DissolveSearch(double frames_per_second);

  // How far before and behind a frame it looks.
  std::int64_t reach() const { return kReach * step_; }
  // How many frames it needs of the history.
  std::int64_t memory() const { return 2 * reach() + kLongest * step_; }

  // Takes the next frame, of which all `reach` behind it are known or will not come. It is in a
  // shot that begins with `first` and ends before `end`, as far as cuts tell. A dissolve that is
  // over by now, if there is one.
  std::optional<ShotBorder> Next(const FrameHistory& history, std::int64_t frame,
                                 std::int64_t first, std::int64_t end);
  // No more frames.
  std::optional<ShotBorder> Finish(const FrameHistory& history);

 private:
  static constexpr int kReach = 28, kLongest = 60;  // of steps

  // A frame that is a mixture of those `width` before and behind it.
  struct Hit {
    std::int64_t frame = 0, width = 0;
    std::int64_t first = 0, end = 0;  // of the shot
    double strength = 0;
  };
  std::optional<Hit> HitAt(const FrameHistory& history, std::int64_t frame, std::int64_t first,
                           std::int64_t end) const;
  std::optional<ShotBorder> BorderOf(const FrameHistory& history) const;

  const std::int64_t step_;  // frames, of about a 30th of a second
  std::vector<Hit> hits_;    // of one dissolve, one a frame
};

}  // namespace calmframe::host
