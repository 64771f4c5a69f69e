#pragma once

#include <string>

#include "apps/calmframe/progress_line.h"
#include "host/media/clip.h"

namespace calmframe {

// Draws a walk down a street with the camera held in the hand, so many frames of 1280x720, 30 a
// second, and shows that as the stage "drawing". The same number gives the same frames. threads: 0
// for all processors. Throws Interrupted, media::Failure (output); then nothing is left at `path`.
void DrawSample(const std::string& path, int frames, const media::EncodeSettings& encode,
                int threads, ProgressLine& progress);

}  // namespace calmframe
