#pragma once

#include <vector>

#include "host/stabilize/measures.h"
#include "host/stabilize/solved_clip.h"
#include "host/stabilize/window/window_path.h"

namespace calmframe::host {

// How the background moves from frame to frame: each takes a point of it to its place in the frame
// before; pixels about the frame's middle. Of the first frame without meaning.
struct Background {
  std::vector<Similarity> in_source, in_plane;  // by what the source shows, and as it is warped
};
// By the tracks that are not deleted. Uses all processors.
Background FindBackground(const SolvedClip& clip);

struct FollowSettings {
  double most_zoom = 1.5;  // of the source, by the window and the warp together; at least 1
  double enlarged = 1;     // on top of that; below 1 the picture gets a rim
  WindowWeights weights = {};
};

// For each frame the part of the stabilized plane that the output shows, as WithWindows takes it:
// the calmest windows that stay where the frame's warp puts the picture, and below the zoom; see
// FindWindowPath. A frame whose warp is folded counts as one that fills the plane's corner.
std::vector<Similarity> FollowWindows(const SolvedClip& clip, const Background& background,
                                      const FollowSettings& settings);

// What the effect shows by itself: its own crop windows, enlarged `zoom` times; without a crop
// windows in the plane's corner, where a frame lies that is not warped.
std::vector<Similarity> OwnWindows(const SolvedClip& clip, double zoom);

// What these windows show.
ShownMotion MotionShown(const SolvedClip& clip, const Background& background,
                        const std::vector<Similarity>& windows);
// What the source shows.
ShownMotion MotionOfSource(const SolvedClip& clip, const Background& background);

}  // namespace calmframe::host
