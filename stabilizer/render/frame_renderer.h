#pragma once

#include <cstddef>

#include "stabilization/crop/cropper.h"
#include "stabilizer/render/clip_warps.h"
#include "stabilizer/render/render_geometry.h"
#include "stabilizer/render/render_settings.h"
#include "stabilizer/render/source_frames.h"
#include "stabilizer/render/world_operations.h"

namespace marrow::render {

// Clears the output and draws the stabilized frame: deblurred where settings say so, its edges
// filled where the framing does. `crop` may be null. False, with nothing done, where the clip has
// no record of the frame.
template <class Pixel>
bool renderFrame(const ClipWarps& warps, const cropper* crop, const RenderSettings& settings,
                 Renderer& renderer, std::size_t frame, SourceFrames<Pixel>& sources,
                 WorldOperations<Pixel>& operations, WorldX<Pixel>& output);

}  // namespace marrow::render
