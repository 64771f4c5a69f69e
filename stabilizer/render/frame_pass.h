#pragma once

#include <cstddef>
#include <optional>

#include "stabilization/crop/cropper.h"
#include "stabilizer/render/clip_warps.h"
#include "stabilizer/render/frame_mesh.h"
#include "stabilizer/render/render_geometry.h"
#include "stabilizer/render/render_settings.h"
#include "stabilizer/render/source_frames.h"
#include "stabilizer/render/world_operations.h"

namespace marrow::render {

// The render of one frame, as its passes share it. All referents outlive it.
template <class Pixel>
struct FramePass {
  const ClipWarps& warps;
  const RenderSettings& settings;
  const Renderer& renderer;
  SourceFrames<Pixel>& sources;
  WorldOperations<Pixel>& operations;
  std::size_t frame;   // the one that the output is of
  crop_rect cropRect;  // of that frame, scaled
  double zoom;
};

// Source frame M's mesh in an output of width x height pixels: by its own record where it is the
// pass's frame, else as it lies in that frame's output. Nothing where no motion is known.
template <class Pixel>
std::optional<FrameMesh> meshOfFrame(const FramePass<Pixel>& pass, std::size_t M, int width,
                                     int height);

// Draws a frame through its mesh over what `output` holds or, with `clears`, over transparent
// black; with `only`, at least what lies in those tiles. The strips run on all processors; their
// number never shows in the result.
template <class Pixel>
void drawMesh(const FrameMesh& mesh, const WorldX<Pixel>& source, WorldX<Pixel>& output,
              const TileMap* only = nullptr, bool clears = false);

// Draws source frame M over what `output` holds or, with `clears`, over transparent black. False,
// with nothing fetched, where no motion is known.
template <class Pixel>
bool drawFrame(const FramePass<Pixel>& pass, std::size_t M, WorldX<Pixel>& output,
               bool clears = false);

}  // namespace marrow::render
