#pragma once

#include <cstdint>
#include <vector>

#include "host/effects/track_point.h"
#include "host/stabilize/solved_clip.h"

namespace calmframe::studio {

// What a person draws around tracks on the picture of one frame.
struct Lasso {
  std::int64_t frame = 0;  // of the clip
  // Its corners, in shares of the picture's width and height: 0, 0 is the top left corner, 1, 1 the
  // bottom right one. What an odd number of its turns goes around is inside. Fewer than three: all.
  std::vector<host::Point> corners;
  bool any_frame = false;  // tracks that are inside in any frame of the clip, not in this one alone
};

struct LassoedTrack {
  host::TrackPoint point;  // in a frame in which it is inside
  host::Point place;       // there, in shares as above
};

// Tracks that are not deleted, each once, by where they are first inside. `fields`: pictures that a
// frame of the clip is of, 1 or 2.
std::vector<LassoedTrack> TracksIn(const Lasso& lasso, const host::SolvedClip& clip, int fields);

}  // namespace calmframe::studio
