#pragma once

#include <limits>
#include <vector>

#include "host/stabilize/similarity.h"

namespace calmframe::host {

// The points (x, y) with nx x + ny y <= limit; (nx, ny) has length 1.
struct HalfPlane {
  double nx = 0, ny = 0, limit = 0;
};

// What a window of a frame may show, and how the picture moves there. All in pixels of the plane
// about the frame's middle, y down.
struct WindowFrame {
  // Where all of these hold there is picture. They bound a convex region with the middle in its
  // inside.
  std::vector<HalfPlane> covered;
  // Takes a background point of this frame to its place in the frame before; of the first frame
  // without meaning.
  Similarity motion;
  // The window shows the plane this many times enlarged at most; above 0. Where no window that
  // large lies in the covered region, the largest that does counts.
  double most_zoom = 1;
  // The output shows the background so many times as large as in the frame before, unless that
  // would take a window outside of what is covered or a larger zoom. Of the first frame without
  // meaning.
  double least_growth = 0, most_growth = std::numeric_limits<double>::infinity();
};

// What is charged. Pixels of a picture 1000 wide, a frame; turning and zooming count as the motion
// of the points at the picture's left and right edge.
struct WindowWeights {
  double motion = 1, change = 10, jerk = 100;  // first, second and third differences: L1 norms
  // A thousandth of the output's width that a frame shows less of the plane. At this, shake that
  // nobody sees is left for a wider window: found on clips of several kinds, where half and twice
  // as much moved the width by some hundredths.
  double width = 0.1;
  // Growth beyond a frame's bounds. High enough that they hold wherever they can: on six filmed
  // clips 100 and 3000 gave the same windows.
  double growth = 300;
};

// The calmest path of a window of `width` x `height` that never leaves what is covered: one
// similarity a frame, which takes output pixels about their middle to the plane. What is minimised
// is the motion of the background as the output shows it. A linear programme (Nocedal and Wright,
// Numerical Optimization, 2nd ed., ch. 14), whose steps are band matrices: linear in frames. The
// same input gives the same path everywhere.
std::vector<Similarity> FindWindowPath(double width, double height,
                                       const std::vector<WindowFrame>& frames,
                                       const WindowWeights& weights);

}  // namespace calmframe::host
