#pragma once

#include <cstddef>
#include <memory>
#include <utility>
#include <vector>

#include "host/stabilize/solved_clip.h"
#include "host/stabilize/window/clip_windows.h"

namespace calmframe::host {

// The middle of a frame, and of the plane's corner where it lies that is not warped.
Point Middle(const SolvedClip& clip);

// Where the warps put one frame of a clip: vertices about the middle of the plane. Refers to the
// clip.
class PlaneFrame {
 public:
  using Vertices = std::shared_ptr<const std::vector<Point>>;
  PlaneFrame(const SolvedClip& clip, Vertices vertices)
      : clip_(&clip), vertices_(std::move(vertices)) {}

  WarpView Warp() const { return {vertices_->data(), clip_->columns, clip_->rows}; }
  // Of a place in the source, in its own pixels; inside of a cell the vertices' bilinear mean.
  Point At(Point source) const;
  // The place in the source that lies there in the plane, also beyond the frame's edges, to a
  // thousandth of a pixel. No numbers where the warp is folded.
  Point SourceAt(Point plane) const;
  // How many times the warp enlarges the frame: the root of its outline's area (the shoelace
  // formula) over the frame's. 0 of a folded one.
  double Scale() const;

 private:
  const SolvedClip* clip_;
  Vertices vertices_;
};

// Where the warps put a clip's frames; without warps all of them to where they are at rest. Refers
// to the clip. Any thread.
class WarpedPlane {
 public:
  WarpedPlane(const SolvedClip& clip, Warps warps);

  const SolvedClip& clip() const { return clip_; }
  Warps warps() const { return rest_ ? Warps::none : Warps::solved; }
  // Expands the frame's warp, so that it is worth keeping for all that is asked of it.
  PlaneFrame Frame(std::size_t frame) const;

 private:
  const SolvedClip& clip_;
  PlaneFrame::Vertices rest_;  // without warps
};

}  // namespace calmframe::host
