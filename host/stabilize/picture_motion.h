#pragma once

#include <cstddef>
#include <vector>

#include "host/stabilize/solved_clip.h"

namespace calmframe::host {

// Where one feature is in consecutive frames.
struct TrackPath {
  std::size_t first = 0;  // frame
  std::vector<Point> points;
};

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
  std::vector<TrackPath> paths;  // of the tracks, pixels about the frame's middle
};

// By the tracks that are not deleted, where the warps put them or where they were filmed. Uses all
// processors; the same on any number.
PictureMotion FindMotion(const SolvedClip& clip, Warps warps);

}  // namespace calmframe::host
