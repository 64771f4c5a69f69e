#pragma once

#include <optional>
#include <vector>

#include "host/stabilize/filled_plane.h"
#include "host/stabilize/measures.h"
#include "host/stabilize/picture_motion.h"
#include "host/stabilize/solved_clip.h"
#include "host/stabilize/warped_plane.h"
#include "host/stabilize/window/window_path.h"

namespace calmframe::host {

struct FollowSettings {
  double most_zoom = 1.5;  // of the source, by the window and the warp together; at least 1
  double enlarged = 1;     // on top of that; below 1 the picture gets a rim
  // Percent a second by which the output's zoom changes at most, at least 0: how fast it shows the
  // background grow or shrink beside what the camera makes of it, calmed. Gives way to the zoom's
  // limit and to what is covered.
  double zoom_speed = 5;
  double frames_per_second = 30;  // above 0; fields, of an interlaced clip
  WindowWeights weights = {};
  std::optional<Filling> filling = {};  // of a framing that fills the edges
};

// For each frame the part of the stabilized plane that the output shows, as WithWindows takes it:
// the calmest windows that stay where the frame's warp puts the picture, and below the zoom; see
// FindWindowPath. A frame whose warp is folded counts as one that fills the plane's corner. Where
// the edges are filled, the windows stay where the picture is once they are: from those that stay
// in the frames on, each round finds the calmest in the parts of the plane that are covered around
// those before. Refers to nothing once it is made. Any thread.
class WindowFinder {
 public:
  WindowFinder(const WarpedPlane& plane, const PictureMotion& motion,
               const FollowSettings& settings);

  // With that weight in the place of the settings'.
  std::vector<Similarity> Find(double width_weight) const;
  const FilledPlane* filled() const { return filled_ ? &*filled_ : nullptr; }

 private:
  const FollowSettings settings_;
  const int width_, height_;
  const Point middle_;
  std::vector<WindowFrame> frames_;
  std::optional<FilledPlane> filled_;
};
std::vector<Similarity> FollowWindows(const WarpedPlane& plane, const PictureMotion& motion,
                                      const FollowSettings& settings);

// What the effect shows by itself: its own crop windows, enlarged `zoom` times; without a crop the
// middle of the bounds of all frames, to a pixel.
std::vector<Similarity> OwnWindows(const SolvedClip& clip, double zoom);

// The whole frame where it lies that is not warped, but for a hundredth of a pixel along its edges:
// there what is drawn rounds to the frame or beside it.
std::vector<Similarity> WholeFrames(const SolvedClip& clip);

// What each of several ways to show a clip by windows shows; they share the paths. `motion`: that
// of the plane. `filled`: what covers it where the edges are filled; else null.
std::vector<ShownMotion> MotionsShown(const WarpedPlane& plane, const PictureMotion& motion,
                                      const std::vector<std::vector<Similarity>>& ways,
                                      const FilledPlane* filled);
ShownMotion MotionShown(const WarpedPlane& plane, const PictureMotion& motion,
                        const std::vector<Similarity>& windows,
                        const std::optional<Filling>& filling = {});
// What the source shows. `motion`: without warps.
ShownMotion MotionOfSource(const SolvedClip& clip, const PictureMotion& motion);

}  // namespace calmframe::host
