#pragma once

#include <cstddef>
#include <vector>

#include "host/stabilize/similarity.h"
#include "host/stabilize/warped_plane.h"
#include "host/stabilize/window/window_path.h"

namespace calmframe::host {

// How a framing fills what a frame leaves empty: with the frames around it, each behind those that
// are nearer.
struct Filling {
  int reach = 0;   // frames on either side
  double rim = 0;  // pixels along every frame's edges that one frame alone doesn't make opaque
};

// The rim of frames of which `cut` pixels are taken off at a side, whose alpha rises over `feather`
// pixels from there on and is multiplied by `boost` in the end; as marrow::render::EdgeSettings and
// RenderSettings have it.
double RimOf(double cut, double feather, double boost);

// What each frame of a plane and the frames around it cover together, where its warp and its
// neighbours' motions put them. All in pixels of the plane about its middle.
class FilledPlane {
 public:
  FilledPlane(const WarpedPlane& plane, const Filling& filling);

  // Four half-planes, along the sides of the part of the plane that a window shows, as far outside
  // of it as all that lies between is covered by what isn't torn off; see Seams. By no more than a
  // sixth of its width. Empty where the window itself isn't covered so. `window`: takes points of
  // an output of the clip's size, about its middle, to the plane.
  std::vector<HalfPlane> RegionAround(std::size_t frame, const Similarity& window) const;
  // Share of the output that nothing covers, 0 to 1; too much by some thousandths at most.
  double UncoveredShare(std::size_t frame, const Similarity& window) const;

 private:
  // Bounds of a convex region.
  using Region = std::vector<HalfPlane>;

  const double width_, height_;
  // By frame: itself, where it has a place, and others; of these all, and what isn't torn off.
  std::vector<std::vector<Region>> covered_, fits_;
};

}  // namespace calmframe::host
