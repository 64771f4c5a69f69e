#pragma once

#include <memory>
#include <utility>

#include "host/stabilize/picture_motion.h"
#include "host/stabilize/solved_clip.h"

namespace calmframe::host {

// A solved clip and how its picture moves, which is found when it is first asked for and then kept.
// For one thread at a time.
class MovingClip {
 public:
  using MotionPtr = std::shared_ptr<const PictureMotion>;

  MovingClip(SolvedClip clip) : clip_(std::move(clip)) {}  // NOLINT: as good as the clip itself
  // What the other one knows of the motion is taken over as far as the same comes of it.
  MovingClip(SolvedClip clip, const MovingClip& other);

  const SolvedClip& clip() const { return clip_; }
  // See FindMotion; by the clip's warps, or without.
  const MotionPtr& motion(Warps warps) const;

 private:
  const SolvedClip clip_;
  mutable MotionPtr solved_, none_;
};

}  // namespace calmframe::host
