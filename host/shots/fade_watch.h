#pragma once

#include <cstdint>
#include <optional>

#include "host/shots/frame_history.h"
#include "host/shots/shot_finder.h"

namespace calmframe::host {

// Watches the contrast for pictures that fade to a plain one, or are cut to it, and another picture
// that comes from there.
class FadeWatch {
 public:
  explicit FadeWatch(double frames_per_second);

  // How many frames it needs of the history.
  std::int64_t memory() const { return 2 * second_; }

  // Takes the history's last frame. `first`: with which its shot begins, as far as cuts tell. A
  // fade that is over by now, if there is one.
  std::optional<ShotBorder> Next(const FrameHistory& history, std::int64_t first);
  // The shot ends before `end`: another begins there, or there are no more frames.
  std::optional<ShotBorder> Finish(const FrameHistory& history, std::int64_t end);

 private:
  enum class State { clear, low, rising };

  void Begin(const FrameHistory& history, std::int64_t first);
  std::optional<ShotBorder> Judge(const FrameHistory& history, std::int64_t end) const;

  const std::int64_t second_;  // in frames
  State state_ = State::clear;

  // Of the picture that goes.
  FrameDigest before_;
  double before_contrast_ = 0;
  bool before_fades_ = false;  // the frames on the way down are the picture, fainter
  std::int64_t before_frame_ = 0;
  // Of the plain frames.
  double least_ = 0;  // contrast
  std::int64_t plain_first_ = 0, plain_last_ = 0;
  std::int64_t rise_ = 0;  // the first frame that is no more low
};

}  // namespace calmframe::host
