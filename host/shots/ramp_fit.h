#pragma once

#include <array>
#include <cstddef>
#include <vector>

#include "host/shots/frame_digest.h"
#include "host/shots/mixture.h"

namespace calmframe::host {

// What a frame shows in each of its parts, whatever moves there.
struct FrameParts {
  static constexpr int kAcross = 4, kDown = 3, kCount = kAcross * kDown;
  std::array<double, kCount> square;               // of the detail, the mean over its cells
  std::array<std::array<double, kCount>, 3> tone;  // mean luma and chroma, in 255ths
};
FrameParts PartsOf(const FrameDigest& digest, const FrameDetail& detail);

// Frames evenly apart, of which one of the first shot is the last that shows it alone, and one
// behind it the first that shows the second alone; between them the share of the second grows
// straight. 0 <= before, before + 1 < behind < frames.size().
struct Ramp {
  std::vector<const FrameParts*> frames;
  std::size_t before = 0, behind = 0;
};

// How the detail's squares go along a ramp. Those of two shots that have nothing to do with each
// other add up to (1 - a)^2 of the first's and a^2 of the second's where the share is a, which is
// less than any mean of both: however both cameras move, all parts lose detail and get it back.
struct DipFit {
  // The share, up to 1, that this explains of what a straight change between both ends, which a
  // camera's motion or light may be, leaves unexplained. Below 0: the straight change fits better.
  double evidence = 0;
  double depth = 0;  // of the dip, in that which the shots' own detail makes expect: about 1
};
DipFit FitDip(const Ramp& ramp);

// How the parts' tones go along a ramp: straight from the first shot's to the second's in a
// dissolve. A thing that passes leaves the line, and so does light that goes and comes back, which
// takes detail along.
struct ToneFit {
  double straight = 0;  // the share of their variance that the ramp explains
  // The distance of both ends, squared, in the sum of both ends' variances over the frame: about 1
  // and more of two scenes.
  double apart = 0;
  // By what share the frame's luma halfway between the ends is above the ramp's, or below: of an
  // arc with its top there, by least squares.
  double light = 0;
};
ToneFit FitTone(const Ramp& ramp);

}  // namespace calmframe::host
