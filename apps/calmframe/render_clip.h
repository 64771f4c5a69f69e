#pragma once

#include "apps/calmframe/progress_line.h"
#include "apps/calmframe/steady_clip.h"
#include "host/media/clip.h"

namespace calmframe {

// Renders every frame of a solved clip, several at a time, and hands them to the writer in order.
// depth: 8, 16 or 32 (float) bits of a component, 0 the least that holds the source. threads:
// frames in work at once, 0 as many as there are processors. Throws Interrupted, SolveFailure,
// media::Failure.
void RenderClip(SteadyClip& clip, int depth, int threads, media::ClipWriter& writer,
                ProgressLine& progress);

}  // namespace calmframe
