#pragma once

#include <optional>
#include <stdexcept>
#include <string>

#include "host/stabilize/steady_clip.h"

namespace calmframe::host {

// What of each frame is shown.
struct WindowSettings {
  // The effect's own crop window, or one that follows the picture. By the controls: the latter
  // where all that shape the path and its window are as they come.
  enum class Kind { by_controls, steady, follow } kind = Kind::by_controls;
  double most_zoom = 0;  // of a window that follows, which it asks for; 0: as Maximum Scale has it
  std::optional<double> zoom_speed;  // of the same; none: as FollowRequest has it
  // Nothing is chosen: the controls as they are, and a window that follows only where it is asked
  // for.
  bool as_set = false;
  Still still = Still::automatic;
};

// A window that follows the picture was asked for, and the controls leave no room for it; one line.
class WindowRefused : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// What a user should know of the effect's own crop window.
struct CropTrouble {
  enum class Kind {
    none,
    nothing_seen,  // no part of the picture stays in view all the time
    black,         // the controls stop the enlargement before the frame is filled
    small,         // little of a side is left
  } kind = Kind::none;
  CropWindow window = {};     // of the last two
  double black = 0;           // share of the frame, 0 to 1
  double needed_percent = 0;  // the least whole Maximum Scale that leaves nothing black, or more
                              // than it takes
};
CropTrouble CropTroubleOf(SteadyClip& clip);
// What a user is told of it, who sees the controls by their names; empty: nothing.
std::string TroubleText(const CropTrouble& trouble);

// After the clip's work: whether windows that follow the picture are what is shown by these
// settings. Throws WindowRefused, SolveFailure.
bool Follows(SteadyClip& clip, const WindowSettings& settings);

// After the clip's work: chooses what is shown of it, and has that drawn from then on; for every
// front end alike. What comes back is the trouble with the effect's own crop window, where that is
// what is shown. Throws WindowRefused, SolveFailure, Interrupted.
[[nodiscard]] CropTrouble ChooseFraming(SteadyClip& clip, const WindowSettings& settings,
                                        Watcher& watcher);

}  // namespace calmframe::host
