#pragma once

#include <string>

#include "apps/calmframe/steady_clip.h"

namespace calmframe {

// Writes the clip's tracks by the effect's own button, which is one for experts: the clip must have
// been opened with `experimental`. `shown`: what the user calls the work. Throws SolveFailure, also
// when nothing was written.
void SaveTracks(SteadyClip& clip, const std::string& shown, const std::string& path);

}  // namespace calmframe
