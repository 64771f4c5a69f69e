#pragma once

#include <vector>

#include "host/stabilize/similarity.h"
#include "host/stabilize/track_paths.h"

namespace calmframe::host {

// Betters motions that were fitted from each frame to the one before by tracks that go on: what
// such fits are off by, since other tracks take part in each, adds up from frame to frame to a
// wander that the tracks themselves don't have. Of each frame the similarity is found that most
// tracks ask for, to lie on their parabolas through the frames around it, which all motions
// together bring to that frame; a track farther off than 1.5 `tolerance` takes no part. `paths` and
// `motions` lie in one plane, pixels about its middle; `motions`: see PictureMotion::background. Of
// fewer than 37 frames they stay as they are. On all processors; the same on any number.
void CorrectByPaths(const std::vector<TrackPath>& paths, double tolerance,
                    std::vector<Similarity>& motions);

}  // namespace calmframe::host
