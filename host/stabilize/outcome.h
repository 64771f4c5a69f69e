#pragma once

#include <nlohmann/json_fwd.hpp>
#include <string>

#include "host/stabilize/follow_windows.h"

namespace calmframe::host {

// What a steadied clip shows, as every front end tells it.
struct Outcome {
  bool follows = false;  // windows that follow the picture; else the effect's own
  bool bends = true;  // frames are warped as the effect solved it; else they are as they were shot
  double width_kept = 1;  // of the source: mean of what the frames show
  double most_zoom = 1;   // of the frame that is enlarged most
  double most_black = 0;  // share of the frame that shows the least, 0 to 1
  Shake before, after;    // of the source, and of this

  // By how much the mean shake has fallen; what nobody sees counts as as little.
  double decibels() const;
  // In one line: "85 % of the width kept, ...".
  std::string Text() const;
  // For programs, an object with all that the line tells and what was chosen: names as above,
  // numbers to four places.
  nlohmann::ordered_json Json() const;
};

// `windows`: see MotionShown.
Outcome MeasureOutcome(const SolvedClip& clip, const Background& background,
                       const std::vector<Similarity>& windows, double frames_per_second);

}  // namespace calmframe::host
