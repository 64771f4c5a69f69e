#pragma once

#include <vector>

#include "host/stabilize/outcome.h"

namespace calmframe::host {

// How a clip is shown by windows that follow its picture.
struct Choice {
  Warps warps = Warps::solved;
  std::vector<Similarity> windows;  // as WithWindows takes them
  Outcome outcome;
};

// What counts for one candidate against another, in decibels.
struct ChoiceWeights {
  double seen = 0.5;   // thousandths of the width: shake far below it is not told from none
  double width = 0.4;  // a hundredth of the source's width that is not shown
  // By how much frames that are shown as shot must be better than bent ones. Bends follow depth and
  // the shutter, which this does not measure; where tracks are short they are noise, which it does.
  double bends = 1;
};

// The better of the solved warps and none, each with its windows; the former alone where
// `may_leave_warps` is not set.
Choice Choose(const SolvedClip& clip, const FollowSettings& settings, double frames_per_second,
              bool may_leave_warps, const ChoiceWeights& weights = {});

}  // namespace calmframe::host
