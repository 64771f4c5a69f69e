#pragma once

#include <memory>
#include <vector>

#include "host/stabilize/picture_motion.h"
#include "host/stabilize/track_paths.h"

namespace calmframe::host {

// How the background moves over the output, and how much of the source that shows.
struct ShownMotion {
  double width = 0, height = 0;  // of the output, square pixels
  // Takes a background point of a frame to its place in the frame before, pixels about the output's
  // middle; of the first frame without meaning.
  std::vector<Similarity> motions;
  std::vector<double> zooms;      // how many times enlarged each frame shows the source
  std::vector<double> uncovered;  // share of each frame where the source shows nothing, 0 to 1
  std::vector<double> wobble;     // pixels of the output; see PictureMotion
  std::shared_ptr<const std::vector<TrackPath>> paths;  // of the tracks; null: none
  // What each frame shows in its middle: square pixels of the source about the frame's own middle,
  // where the camera was pointed. No number where the frame's warp is folded.
  std::vector<Point> aims;
  // What takes a frame's points of the paths to the output; empty: they are in it.
  std::vector<Similarity> to_output = {};
};

// Motion that is faster than about 0.9 Hz, in pixels of a picture 1000 wide: how far the path of
// each of 5 x 5 places is from its local quadratic over 0.6 s to either side (Savitzky and Golay,
// Analytical Chemistry 36, 1964); of a frame the median over the places. All 0 for clips of fewer
// than five frames.
struct Shake {
  double mean = 0;      // over the frames
  double p95 = 0;       // that a twentieth of the frames exceed
  double worst = 0;     // mean of the worst second
  double worst_at = 0;  // its middle, in seconds from the first frame
};
Shake MeasureShake(const ShownMotion& shown, double frames_per_second);

// How far what is shown leaves what the camera was pointed at, in thousandths of the width: a pan
// that comes late, or goes on too far. Both ends of it without what MeasureShake takes for shake;
// the turn and the zoom don't count. All 0 for clips of fewer than five frames.
struct Straying {
  double mean = 0;   // over the frames
  double worst = 0;  // mean of the worst second
};
Straying MeasureStraying(const ShownMotion& shown, double frames_per_second);

// Mean over the frames of which it can be told, in thousandths of the width.
double MeasureWobble(const ShownMotion& shown);

// The same as Shake::mean of what was tracked, near things with far ones: of a frame the median
// over the tracks that reach so far to either side. 0 where no frame has three of them.
double MeasureTrackShake(const ShownMotion& shown, double frames_per_second);

}  // namespace calmframe::host
