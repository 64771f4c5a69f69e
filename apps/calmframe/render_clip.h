#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "apps/calmframe/progress_line.h"
#include "apps/calmframe/side_by_side.h"
#include "host/media/clip.h"
#include "host/pixels/world_buffer.h"
#include "host/stabilize/steady_clip.h"
#include "host/timeline/picture.h"

namespace calmframe {

using host::SteadyClip;

// A frame as it is to be written.
struct DrawnFrame {
  std::shared_ptr<host::WorldBuffer> pixels;
  host::PicturePtr shot;  // as the clip has it, at the same depth; null unless it is asked for
  std::string banner;     // what the effect's banner over it says; empty: it has none
};

// depth: 8, 16 or 32 (float) bits of a component, 0 what the source and its framing need.
// downsample: a side is drawn with one pixel in so many. threads: frames in work at once, 0 as many
// as there are processors. warning_banner: over frames that could not be steadied as asked, the
// effect's banner; whatever the clip's own control says. shots: with the frames as they were shot;
// or shot_of: with that one.
struct RenderSettings {
  int depth = 0;
  int downsample = 1;
  int threads = 0;
  bool warning_banner = false;
  bool shots = false;
  std::optional<std::size_t> shot_of = {};
};

// Renders a solved clip's frames, several at a time, and gives them out in order, with their number
// in it. `stage`: what the progress is called; it has not ended before finish(), if there is
// such, has. Gives one line for each thing that banners say, drawn or not. Throws Interrupted,
// SolveFailure, media::Failure, and what `take` and `finish` throw.
std::vector<std::string> RenderFrames(
    SteadyClip& clip, const media::FrameRange& range, const RenderSettings& settings,
    const std::string& stage, ProgressLine& progress,
    const std::function<void(std::size_t, const DrawnFrame&)>& take,
    const std::function<void()>& finish = {});

// Writes a frame of any depth.
void Write(media::ClipWriter& writer, std::size_t frame, const host::WorldBuffer& pixels);

// What the writers warn of and was not told yet, such as what a file can't keep of the clip. `both`
// may be null.
void TellLosses(const media::ClipWriter& writer, const SideBySide* both, ProgressLine& progress);

// The same into a file, and into one of before and after, if there is such: the range's first frame
// becomes the output's frame `at`. With the last ones the files are whole. What banners say, and
// the writers' warnings, are told; and of the output's frame `thumbnail`, if these have it, what it
// looks like before and after, small.
void RenderClip(SteadyClip& clip, const media::FrameRange& range, const RenderSettings& settings,
                std::size_t at, bool last, std::optional<std::size_t> thumbnail,
                media::ClipWriter& writer, SideBySide* both, ProgressLine& progress);

}  // namespace calmframe
