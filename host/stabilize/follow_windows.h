#pragma once

#include <optional>
#include <vector>

#include "host/stabilize/filled_plane.h"
#include "host/stabilize/measures.h"
#include "host/stabilize/picture_motion.h"
#include "host/stabilize/solved_clip.h"
#include "host/stabilize/window/window_path.h"

namespace calmframe::host {

struct FollowSettings {
  double most_zoom = 1.5;  // of the source, by the window and the warp together; at least 1
  double enlarged = 1;     // on top of that; below 1 the picture gets a rim
  WindowWeights weights = {};
  std::optional<Filling> filling = {};  // of a framing that fills the edges; it shows frames warped
};

// For each frame the part of the stabilized plane that the output shows, as WithWindows takes it:
// the calmest windows that stay where the frame's warp puts the picture, and below the zoom; see
// FindWindowPath. A frame whose warp is folded counts as one that fills the plane's corner. Where
// the edges are filled, the windows stay where the picture is once they are: from those that stay
// in the frames on, each round finds the calmest in the parts of the plane that are covered around
// those before.
std::vector<Similarity> FollowWindows(const SolvedClip& clip, Warps warps,
                                      const PictureMotion& motion, const FollowSettings& settings);

// What the effect shows by itself: its own crop windows, enlarged `zoom` times; without a crop
// windows in the plane's corner, where a frame lies that is not warped.
std::vector<Similarity> OwnWindows(const SolvedClip& clip, double zoom);

// What these windows show. `motion`: that of the plane, with its warps or without.
ShownMotion MotionShown(const SolvedClip& clip, Warps warps, const PictureMotion& motion,
                        const std::vector<Similarity>& windows,
                        const std::optional<Filling>& filling = {});
// What the source shows. `motion`: without warps.
ShownMotion MotionOfSource(const SolvedClip& clip, const PictureMotion& motion);

}  // namespace calmframe::host
