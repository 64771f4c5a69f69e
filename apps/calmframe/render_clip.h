#pragma once

#include "apps/calmframe/progress_line.h"
#include "apps/calmframe/steady_clip.h"
#include "host/media/clip.h"

namespace calmframe {

// Frames of a clip, the end excluded.
struct FrameRange {
  std::size_t first = 0, end = 0;
};

// Renders a solved clip's frames, several at a time, and hands them to the writer in order, counted
// from the range's first. depth: 8, 16 or 32 (float) bits of a component, 0 the least that holds
// the source. threads: frames in work at once, 0 as many as there are processors. Throws
// Interrupted, SolveFailure, media::Failure.
void RenderClip(SteadyClip& clip, const FrameRange& range, int depth, int threads,
                media::ClipWriter& writer, ProgressLine& progress);

}  // namespace calmframe
