#pragma once

#include <cstddef>
#include <functional>
#include <string>
#include <vector>

#include "apps/calmframe/progress_line.h"
#include "apps/calmframe/steady_clip.h"
#include "host/media/clip.h"
#include "host/pixels/world_buffer.h"

namespace calmframe {

// depth: 8, 16 or 32 (float) bits of a component, 0 what the source and its framing need.
// downsample: a side is drawn with one pixel in so many. threads: frames in work at once, 0 as many
// as there are processors. warning_banner: over frames that could not be steadied as asked, the
// effect's banner; whatever the clip's own control says.
struct RenderSettings {
  int depth = 0;
  int downsample = 1;
  int threads = 0;
  bool warning_banner = false;
};

// Renders a solved clip's frames, several at a time, and gives them out in order, with their number
// in it. `stage`: what the progress is called; it has not ended before finish(), if there is
// such, has. Gives one line for each thing that banners say, drawn or not. Throws Interrupted,
// SolveFailure, media::Failure, and what `take` and `finish` throw.
std::vector<std::string> RenderFrames(
    SteadyClip& clip, const media::FrameRange& range, const RenderSettings& settings,
    const std::string& stage, ProgressLine& progress,
    const std::function<void(std::size_t, const host::WorldBuffer&)>& take,
    const std::function<void()>& finish = {});

// What the writer warns of and was not told yet, such as what its file can't keep of the clip.
void TellLosses(const media::ClipWriter& writer, ProgressLine& progress);

// The same into a file, which is then whole: frames are counted from the range's first. What
// banners say, and the writer's warnings, are told.
void RenderClip(SteadyClip& clip, const media::FrameRange& range, const RenderSettings& settings,
                media::ClipWriter& writer, ProgressLine& progress);

}  // namespace calmframe
