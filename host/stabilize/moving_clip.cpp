#include "host/stabilize/moving_clip.h"

#include <cstddef>
#include <utility>

#include "host/stabilize/warped_plane.h"

namespace calmframe::host {
namespace {

template <class Of>
bool AreSame(const SolvedClip& a, const SolvedClip& b, Of SolvedClip::*of_frame) {
  for (std::size_t f = 0; f < static_cast<std::size_t>(a.frame_count); ++f) {
    if ((a.*of_frame)(f) != (b.*of_frame)(f)) return false;
  }
  return true;
}

bool HaveSameTracks(const SolvedClip& a, const SolvedClip& b) {
  return a.source_width == b.source_width && a.source_height == b.source_height &&
         a.width == b.width && a.height == b.height && a.first_frame == b.first_frame &&
         a.frame_count == b.frame_count && a.slots == b.slots && a.columns == b.columns &&
         a.rows == b.rows && AreSame(a, b, &SolvedClip::TracksOf);
}

}  // namespace

MovingClip::MovingClip(SolvedClip clip, const MovingClip& other) : clip_(std::move(clip)) {
  if (!HaveSameTracks(clip_, other.clip_)) return;
  none_ = other.none_;
  if (AreSame(clip_, other.clip_, &SolvedClip::VerticesOf)) solved_ = other.solved_;
}

const MovingClip::MotionPtr& MovingClip::motion(Warps warps) const {
  MotionPtr& motion = warps == Warps::none ? none_ : solved_;
  if (!motion) {
    motion = std::make_shared<const PictureMotion>(FindMotion(WarpedPlane(clip_, warps)));
  }
  return motion;
}

}  // namespace calmframe::host
