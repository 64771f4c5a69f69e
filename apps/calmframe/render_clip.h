#pragma once

#include <cstddef>
#include <functional>
#include <string>

#include "apps/calmframe/progress_line.h"
#include "host/media/clip.h"
#include "host/pixels/world_buffer.h"
#include "host/stabilize/steady_clip.h"

namespace calmframe {

using host::SteadyClip;

// Frames of a clip, the end excluded.
struct FrameRange {
  std::size_t first = 0, end = 0;
};

// depth: 8, 16 or 32 (float) bits of a component, 0 what the source and its framing need.
// downsample: a side is drawn with one pixel in so many. threads: frames in work at once, 0 as many
// as there are processors.
struct RenderSettings {
  int depth = 0;
  int downsample = 1;
  int threads = 0;
};

// Renders a solved clip's frames, several at a time, and gives them out in order, with their number
// in the clip. `stage`: what the progress is called; it has not ended before finish(), if there is
// such, has. Throws Interrupted, SolveFailure, media::Failure, and what `take` and `finish` throw.
void RenderFrames(SteadyClip& clip, const FrameRange& range, const RenderSettings& settings,
                  const std::string& stage, ProgressLine& progress,
                  const std::function<void(std::size_t, const host::WorldBuffer&)>& take,
                  const std::function<void()>& finish = {});

// What the writer warns of and was not told yet, such as what its file can't keep of the clip.
void TellLosses(const media::ClipWriter& writer, ProgressLine& progress);

// The same into a file, which is then whole: frames are counted from the range's first. The
// writer's warnings are told.
void RenderClip(SteadyClip& clip, const FrameRange& range, const RenderSettings& settings,
                media::ClipWriter& writer, ProgressLine& progress);

}  // namespace calmframe
