#pragma once

#include <vector>

#include "host/stabilize/follow_windows.h"
#include "host/stabilize/moving_clip.h"

namespace calmframe::host {

// Where in its frame the part lies that the output shows: square pixels of the source about the
// frame's middle, y down. No numbers where the frame's warp is folded.
struct WindowPlace {
  Point centre;
  // How far the centre may go along each axis before the window, as large and as turned as it is,
  // leaves the frame; beyond them something is black or filled. Least above most: it is larger.
  Point least, most;
};

// How a clip moves as it was filmed and as the output shows it, and by which windows.
struct ShownPath {
  ShownMotion source, output;
  std::vector<WindowPlace> windows;  // one a frame
  double most_zoom = 1;              // that the output's zooms are held to
};

// Of windows as FollowWindows and OwnWindows have them; most_zoom is the caller's.
ShownPath PathShown(const MovingClip& clip, Warps warps, const std::vector<Similarity>& windows);

}  // namespace calmframe::host
