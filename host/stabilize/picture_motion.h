#pragma once

#include <cstddef>
#include <vector>

#include "host/stabilize/warped_plane.h"

namespace calmframe::host {

// How the picture moves in a plane, frame by frame.
struct PictureMotion {
  // Takes a point of the background to its place in the frame before; pixels about the frame's
  // middle. Of the first frame without meaning.
  std::vector<Similarity> background;
  // How much the picture's own shape flickers, in pixels: the part of the motion from the frame
  // before that no homography explains, its median in each of 12 x 7 cells of the picture that hold
  // tracks, less the mean of the two neighbours in time, so that parallax, which lasts, drops out;
  // root mean square over the cells. 0 where nothing can be told.
  std::vector<double> wobble;
};

// By the tracks of the plane's clip that are not deleted. Uses all processors; the same on any
// number.
PictureMotion FindMotion(const WarpedPlane& plane);

}  // namespace calmframe::host
