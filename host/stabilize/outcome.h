#pragma once

#include <cstddef>
#include <cstdint>
#include <nlohmann/json_fwd.hpp>
#include <string>
#include <vector>

#include "host/stabilize/follow_windows.h"

namespace calmframe::host {

// What a steadied clip shows, as every front end tells it.
struct Outcome {
  // The effect's own window, one that follows the picture, or the whole frame as it was filmed.
  enum class Window : std::uint8_t { steady, follow, none } window = Window::steady;
  bool bends = true;  // frames are warped as the effect solved it; else they are as they were shot
  double width_kept = 1;                       // of the source: mean of what the frames show
  double most_zoom = 1;                        // of the frame that is enlarged most
  double most_black = 0;                       // share of the frame that shows the least, 0 to 1
  Shake before, after;                         // of the source, and of this
  double wobble_before = 0, wobble_after = 0;  // see MeasureWobble
  double tracks_before = 0, tracks_after = 0;  // see MeasureTrackShake
  Straying straying;                           // of this from what the camera was pointed at

  // By how much the mean shake has fallen; what nobody sees counts as as little.
  double decibels() const;
  // In one line: "85 % of the width kept, ...".
  std::string Text() const;
  // For programs, an object with all that the line tells and what was chosen: names as above,
  // numbers to four places.
  nlohmann::ordered_json Json() const;
  // Of such an object, as far as that tells. Throws nlohmann::json::exception,
  // and std::invalid_argument for a window that there is not.
  static Outcome Parse(const nlohmann::json& object);
};

// Of what could not be steadied: the whole frames as they were filmed.
Outcome AsFilmed();

// What a shot of a film shows.
struct ShotOutcome {
  Outcome outcome;
  double begins = 0;       // seconds from the film's first frame
  std::size_t frames = 0;  // 1 at least
};
// Of the film as a whole, of one shot at least: means weighed by frames, the greatest zoom and
// black, the worst moment of all.
Outcome OutcomeOf(const std::vector<ShotOutcome>& shots);

// What the source shows, as if it were a steadied clip; see MotionOfSource.
Outcome MeasureSource(const ShownMotion& source, double frames_per_second);
// `source`: what that tells of it.
Outcome MeasureOutcome(const Outcome& source, const ShownMotion& shown, double frames_per_second);

}  // namespace calmframe::host
