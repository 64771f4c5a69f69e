#pragma once

#include <string>

#include "host/stabilize/steady_clip.h"

namespace calmframe {

// Writes the clip's tracks to `path` by the effect's own button, which is one for experts. The
// file is looked at, since the button doesn't tell how it went. `work`, `file`: what
// the user calls the saved work and the file. Throws SolveFailure where there are no tracks,
// media::Failure (output) where the file isn't whole.
void SaveTracks(host::SteadyClip& clip, const std::string& work, const std::string& path,
                const std::string& file);

}  // namespace calmframe
