#include "host/stabilize/moving_clip.h"

#include <utility>

#include "host/stabilize/warped_plane.h"

namespace calmframe::host {
namespace {

bool HaveSameTracks(const SolvedClip& a, const SolvedClip& b) {
  return a.source_width == b.source_width && a.source_height == b.source_height &&
         a.width == b.width && a.height == b.height && a.first_frame == b.first_frame &&
         a.frame_count == b.frame_count && a.slots == b.slots && a.columns == b.columns &&
         a.rows == b.rows && a.statuses == b.statuses && a.tracks == b.tracks;
}

}  // namespace

MovingClip::MovingClip(SolvedClip clip, const MovingClip& other) : clip_(std::move(clip)) {
  if (!HaveSameTracks(clip_, other.clip_)) return;
  none_ = other.none_;
  if (clip_.vertices == other.clip_.vertices) solved_ = other.solved_;
}

const MovingClip::MotionPtr& MovingClip::motion(Warps warps) const {
  MotionPtr& motion = warps == Warps::none ? none_ : solved_;
  if (!motion) {
    motion = std::make_shared<const PictureMotion>(FindMotion(WarpedPlane(clip_, warps)));
  }
  return motion;
}

}  // namespace calmframe::host
