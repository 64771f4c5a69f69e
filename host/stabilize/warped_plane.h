#pragma once

#include <cstddef>
#include <vector>

#include "host/stabilize/solved_clip.h"
#include "host/stabilize/window/clip_windows.h"

namespace calmframe::host {

// The middle of a frame, and of the plane's corner where it lies that is not warped.
Point Middle(const SolvedClip& clip);

// Where the warps put a clip's frames: vertices about the middle of the plane, frame by frame;
// without warps one grid for all, at rest. Refers to the clip.
class WarpedPlane {
 public:
  WarpedPlane(const SolvedClip& clip, Warps warps);

  const SolvedClip& clip() const { return clip_; }
  Warps warps() const { return of_frame_ > 0 ? Warps::solved : Warps::none; }

  WarpView Warp(std::size_t frame) const {
    return {vertices_.data() + frame * of_frame_, clip_.columns, clip_.rows};
  }
  // Of a place in the source, in its own pixels; inside of a cell the vertices' bilinear mean.
  Point At(std::size_t frame, Point source) const;
  // The place in the source that lies there in the plane, also beyond the frame's edges, to a
  // thousandth of a pixel. No numbers where the warp is folded.
  Point SourceAt(std::size_t frame, Point plane) const;
  // How many times the warp enlarges the frame: the root of its outline's area (the shoelace
  // formula) over the frame's. 0 of a folded one.
  double Scale(std::size_t frame) const;

 private:
  const SolvedClip& clip_;
  std::vector<Point> vertices_;
  std::size_t of_frame_;  // from a frame's to the next one's
};

}  // namespace calmframe::host
