#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "host/effects/renderer.h"
#include "host/media/clip.h"
#include "host/pixels/world_buffer.h"
#include "host/stabilize/steady_clip.h"

namespace calmframe::host {

// A frame as the output shows it.
struct SteadyFrame {
  std::shared_ptr<WorldBuffer> pixels;
  std::string banner;  // what the effect's banner over it says, drawn or hidden; empty: it has none
};

// The least depth, in bits of a component, that holds the source and its framing.
int DepthFor(const SteadyClip& clip);

// Before renderers are made of clip.drawn(): its banner is drawn or hidden, whatever the clip's own
// control says, and the cache has room for the frames that `threads` renders look at. Throws
// SolveFailure.
void PrepareDrawing(SteadyClip& clip, int depth, int threads, bool warning_banner);

// Of the layer's frame, counted from its in-point, at a depth of 8, 16 or 32 bits. Both fields of
// an interlaced one. downsample: a side is drawn with one pixel in so many. Throws SolveFailure.
SteadyFrame DrawFrame(Renderer& renderer, std::int64_t frame, int depth, media::FieldOrder order,
                      int downsample = 1);

}  // namespace calmframe::host
